// Internal: the shared state of an OperationQueue. Operations hold it weakly
// and report readiness changes and their finish to it; drain jobs on the
// worker pool hold it strongly while they start operations.
#pragma once

#include <condition_variable>
#include <cstdint>
#include <list>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include "kivi/foundation/operation.h"

namespace kivi::detail {

struct QueueCore : std::enable_shared_from_this<QueueCore> {
  mutable std::mutex mutex;
  std::condition_variable left;     // an operation left the queue
  std::size_t waiters = 0;          // guarded by mutex: threads waiting on `left`
  std::list<OperationPtr> pending;  // guarded by mutex: not started, in add order
  std::list<OperationPtr> running;  // guarded by mutex: started, not finished
  std::size_t readyPending = 0;     // guarded by mutex: pending ops last read ready
  std::size_t searching = 0;        // guarded by mutex: drain jobs looking for work
  std::uint64_t nextSequence = 0;   // guarded by mutex
  std::int64_t maxCount = -1;       // guarded by mutex
  bool suspended = false;           // guarded by mutex
  std::string name;                 // guarded by mutex
  // Holds the core alive while it has operations. Guarded by mutex.
  std::shared_ptr<QueueCore> keepAlive;

  // False when refused.
  bool add(const OperationPtr& operation);
  void readinessChanged(Operation& operation);
  void operationFinished(Operation& operation);
  // Under mutex: how many drain jobs to launch now. `ownOperationFinishing`:
  // the caller is a drain job whose current operation just finished, and
  // will look for more work as soon as its start() returns.
  std::size_t drainersNeededLocked(bool ownOperationFinishing);
  void launchDrainers(std::size_t count);
  void drain();
  std::int64_t limitLocked() const;
  // Under mutex: the queue's operations in add order.
  std::vector<OperationPtr> operationsLocked() const;
  // Under mutex: whether the queue has seen each of `operations` finish.
  static bool allDoneLocked(const std::vector<OperationPtr>& operations);
};

}  // namespace kivi::detail

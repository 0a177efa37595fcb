// Internal: the shared state of an OperationQueue. Operations hold it weakly
// and report readiness changes and their finish to it; drain jobs on the
// worker pool hold it strongly while they start operations.
#pragma once

#include <condition_variable>
#include <cstdint>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include "kivi/dispatch/operation.h"

namespace kivi::detail {

// A list of operations linked through their queue slots: adding, removing
// and moving between lists allocate nothing. Guarded by the owning core's
// mutex.
class SlotList {
 public:
  bool empty() const { return head_ == nullptr; }
  std::size_t size() const { return size_; }
  Operation* front() const { return head_; }
  static Operation* next(const Operation* operation) { return operation->slot_.next; }

  void pushBack(Operation* operation) {
    auto& slot = operation->slot_;
    slot.previous = tail_;
    slot.next = nullptr;
    (tail_ ? tail_->slot_.next : head_) = operation;
    tail_ = operation;
    ++size_;
  }

  void remove(Operation* operation) {
    auto& slot = operation->slot_;
    (slot.previous ? slot.previous->slot_.next : head_) = slot.next;
    (slot.next ? slot.next->slot_.previous : tail_) = slot.previous;
    slot.previous = slot.next = nullptr;
    --size_;
  }

 private:
  Operation* head_ = nullptr;
  Operation* tail_ = nullptr;
  std::size_t size_ = 0;
};

struct QueueCore : std::enable_shared_from_this<QueueCore> {
  mutable std::mutex mutex;
  std::condition_variable left;    // an operation left the queue
  std::size_t emptyWaiters = 0;    // guarded by mutex: waiting for the queue to empty
  std::size_t batchWaiters = 0;    // guarded by mutex: waiting for some operations
  SlotList pending;                // guarded by mutex: not started, in add order
  SlotList running;                // guarded by mutex: started, not finished
  std::size_t readyPending = 0;    // guarded by mutex: pending ops last read ready
  std::size_t searching = 0;       // guarded by mutex: drain jobs looking for work
  std::uint64_t nextSequence = 0;  // guarded by mutex
  std::int64_t maxCount = -1;      // guarded by mutex
  bool suspended = false;          // guarded by mutex
  std::string name;                // guarded by mutex
  // Holds the core alive while it has operations. Guarded by mutex.
  std::shared_ptr<QueueCore> keepAlive;

  // False when refused.
  bool add(const OperationPtr& operation);
  void readinessChanged(Operation& operation);
  // Takes a finished operation out of the queue. False when that is left to
  // the drain job whose start() call it finished in: the job retires it when
  // start() returns and then delivers the finish to waiters itself.
  bool operationFinished(Operation& operation);
  // Under mutex: how many drain jobs to launch now (counted as searching).
  std::size_t drainersNeededLocked();
  // References that leave the queue with a finished operation; dropped
  // outside the lock, since dropping one may run arbitrary destructors.
  struct Retired {
    OperationPtr operation;
    OperationPtr held;
    std::shared_ptr<QueueCore> keeper;
    bool deliverFinish = false;  // `operation`'s finish waits for its retirement
  };
  // Outside mutex: delivers a deferred finish, then drops the references.
  static void settle(Retired& retired);
  // Under mutex: takes a finished operation out of the queue. Returns the
  // drain jobs to launch.
  std::size_t retireLocked(Operation& operation, Retired& retired);
  void launchDrainers(std::size_t count);
  void drain();
  std::int64_t limitLocked() const;
  // Under mutex: the queue's operations in add order.
  std::vector<OperationPtr> operationsLocked() const;
  // Under mutex: whether the queue has seen each of `operations` finish.
  static bool allDoneLocked(const std::vector<OperationPtr>& operations);
};

}  // namespace kivi::detail

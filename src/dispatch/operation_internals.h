// Internal: an operation's own state, and the shared state of an operation
// queue. Operations hold their queue weakly and report readiness changes and
// their finish to it; drain jobs on the worker pool hold it strongly while
// they start operations.
#pragma once

#include <atomic>
#include <condition_variable>
#include <cstdint>
#include <functional>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include "kivi/dispatch/operation.h"
#include "latch.h"

namespace kivi::detail {

// A queue's record of one of its operations, in its pending or running
// list. It lives in the operation's own state, so queueing allocates nothing.
struct QueueEntry {
  OperationPtr operation;  // the queue's reference
  QueueEntry* previous = nullptr;
  QueueEntry* next = nullptr;
  std::uint64_t sequence = 0;    // add order
  std::uint64_t readyEpoch = 0;  // of the readiness last read
  bool ready = false;            // readiness last read
  bool started = false;          // in the running list
};

struct OperationState {
  mutable std::mutex mutex;
  std::vector<OperationPtr> dependencies;            // guarded by mutex
  std::vector<std::weak_ptr<Operation>> dependents;  // guarded by mutex
  std::function<void()> completionBlock;             // guarded by mutex
  std::string name;                                  // guarded by mutex
  std::weak_ptr<QueueCore> queue;                    // guarded by mutex; set once

  std::atomic<bool> cancelled{false};
  std::atomic<bool> cancelAnnounced{false};
  std::atomic<bool> baseStarted{false};
  std::atomic<bool> baseExecuting{false};
  std::atomic<bool> baseFinished{false};
  // The base start() turned the operation away because it was not ready.
  std::atomic<bool> refusedNotReady{false};
  std::atomic<bool> finishHandled{false};
  // Set, and waiters woken, once everything finishing entails is done.
  detail::Latch finishDelivered;
  std::atomic<bool> enqueued{false};
  // Its queue has called start(): readiness no longer matters to the queue.
  std::atomic<bool> queueStarted{false};
  std::atomic<std::size_t> dependencyCount{0};  // dependencies.size()
  std::atomic<std::uint64_t> readyEpoch{0};

  // The queue's entry: `entry` points to `queueEntry` while the operation is
  // in a queue. Both guarded by that queue's mutex.
  QueueEntry queueEntry;
  QueueEntry* entry = nullptr;
};

// A list of entries linked through themselves. Guarded by the core's mutex.
class EntryList {
 public:
  bool empty() const { return head_ == nullptr; }
  std::size_t size() const { return size_; }
  QueueEntry* front() const { return head_; }

  void pushBack(QueueEntry* entry) { insertBefore(nullptr, entry); }
  // Inserts before `position` (at the end when null).
  void insertBefore(QueueEntry* position, QueueEntry* entry);
  void remove(QueueEntry* entry);

 private:
  QueueEntry* head_ = nullptr;
  QueueEntry* tail_ = nullptr;
  std::size_t size_ = 0;
};

struct QueueCore : std::enable_shared_from_this<QueueCore> {
  ~QueueCore();

  mutable std::mutex mutex;
  std::condition_variable left;    // an operation left the queue
  std::size_t emptyWaiters = 0;    // guarded by mutex: waiting for the queue to empty
  std::size_t batchWaiters = 0;    // guarded by mutex: waiting for some operations
  EntryList pending;               // guarded by mutex: not started, in add order
  EntryList running;               // guarded by mutex: started, not finished
  std::size_t readyPending = 0;    // guarded by mutex: pending entries last read ready
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
  // Under mutex: puts an operation whose start() turned it away back among
  // the pending ones, in its place, as not ready.
  void requeueLocked(QueueEntry* entry);
  void launchDrainers(std::size_t count);
  void drain();
  std::int64_t limitLocked() const;
  // Under mutex: the queue's operations in add order.
  std::vector<OperationPtr> operationsLocked() const;
  // Under mutex: whether the queue has let each of `operations` go.
  static bool allDoneLocked(const std::vector<OperationPtr>& operations);

  static OperationState& stateOf(const Operation& operation) { return operation.state(); }
};

}  // namespace kivi::detail

#include "kivi/dispatch/operation_queue.h"

#include <algorithm>
#include <utility>

#include "kivi/dispatch/worker_pool.h"
#include "queue_core.h"

namespace kivi {

namespace detail {

namespace {
// The queue whose drain job runs on this thread, and the operation it is
// starting.
thread_local const QueueCore* tDrainCore = nullptr;
thread_local const Operation* tDrainOperation = nullptr;
// Set when that operation finished inside its start().
thread_local bool tDrainOperationFinished = false;
}  // namespace

std::int64_t QueueCore::limitLocked() const {
  return maxCount < 0 ? OperationQueue::kDefaultConcurrency : maxCount;
}

bool QueueCore::add(const OperationPtr& operation) {
  if (!operation || operation->isFinished()) return false;
  if (operation->enqueued_.exchange(true)) return false;
  const std::uint64_t epoch = ++operation->readyEpoch_;
  const bool ready = operation->isReady();
  std::size_t drainers = 0;
  {
    std::lock_guard lock(mutex);
    auto& slot = operation->slot_;
    slot.listed = true;
    slot.sequence = nextSequence++;
    slot.held = operation;
    pending.pushBack(operation.get());
    slot.ready = ready;
    slot.readyEpoch = epoch;
    if (ready) ++readyPending;
    if (!keepAlive) keepAlive = shared_from_this();
    drainers = drainersNeededLocked();
  }
  {
    std::lock_guard lock(operation->mutex_);
    operation->queue_ = weak_from_this();
  }
  launchDrainers(drainers);
  // Announcements made before the operation knew its queue did not reach us.
  if (operation->finishHandled_) {
    operationFinished(*operation);
  } else if (operation->readyEpoch_.load() != epoch) {
    readinessChanged(*operation);
  }
  return true;
}

void QueueCore::readinessChanged(Operation& operation) {
  const std::uint64_t epoch = ++operation.readyEpoch_;
  const bool ready = operation.isReady();
  std::size_t drainers = 0;
  {
    std::lock_guard lock(mutex);
    auto& slot = operation.slot_;
    if (!slot.listed || slot.started || epoch <= slot.readyEpoch) return;
    slot.readyEpoch = epoch;
    if (slot.ready == ready) return;
    slot.ready = ready;
    ready ? ++readyPending : --readyPending;
    drainers = drainersNeededLocked();
  }
  launchDrainers(drainers);
}

bool QueueCore::operationFinished(Operation& operation) {
  if (tDrainCore == this && tDrainOperation == &operation) {
    // Finished inside the start() that a drain job of ours is running: the
    // job takes it out of the queue as soon as start() returns, in the same
    // locked section in which it looks for the next operation.
    tDrainOperationFinished = true;
    return false;
  }
  Retired retired;
  std::size_t drainers = 0;
  {
    std::lock_guard lock(mutex);
    drainers = retireLocked(operation, retired);
  }
  launchDrainers(drainers);
  return true;
}

void QueueCore::settle(Retired& retired) {
  if (retired.deliverFinish) retired.operation->deliverFinish();
  retired = {};
}

std::size_t QueueCore::retireLocked(Operation& operation, Retired& retired) {
  auto& slot = operation.slot_;
  if (!slot.listed || slot.done) return 0;
  slot.done = true;
  slot.listed = false;
  retired.held = std::move(slot.held);
  if (slot.started) {
    running.remove(&operation);
  } else {
    pending.remove(&operation);
    if (slot.ready) --readyPending;
  }
  const bool empty = pending.empty() && running.empty();
  if (empty) retired.keeper = std::move(keepAlive);
  if (batchWaiters || (emptyWaiters && empty)) left.notify_all();
  return drainersNeededLocked();
}

std::size_t QueueCore::drainersNeededLocked() {
  if (suspended) return 0;
  const auto limit = static_cast<std::size_t>(limitLocked());
  std::size_t count = 0;
  while (searching < readyPending && running.size() + searching < limit) {
    ++searching;
    ++count;
  }
  return count;
}

void QueueCore::launchDrainers(std::size_t count) {
  for (std::size_t i = 0; i < count; ++i) {
    WorkerPool::shared().submit([core = shared_from_this()] { core->drain(); });
  }
}

void QueueCore::drain() {
  tDrainCore = this;
  Retired retired;           // references to drop once the lock is released
  std::size_t drainers = 0;  // likewise, drain jobs to launch
  std::unique_lock lock(mutex);
  for (;;) {
    OperationPtr operation;
    if (!suspended && running.size() < static_cast<std::size_t>(limitLocked())) {
      for (Operation* op = pending.front(); op; op = SlotList::next(op)) {
        if (op->slot_.ready) {
          operation = op->slot_.held;
          break;
        }
      }
    }
    --searching;
    if (!operation) break;
    --readyPending;
    auto& slot = operation->slot_;
    pending.remove(operation.get());
    running.pushBack(operation.get());
    slot.started = true;
    operation->queueStarted_.store(true, std::memory_order_release);
    lock.unlock();
    settle(retired);
    launchDrainers(std::exchange(drainers, 0));
    tDrainOperation = operation.get();
    tDrainOperationFinished = false;
    operation->start();
    tDrainOperation = nullptr;
    lock.lock();
    ++searching;
    if (tDrainOperationFinished) drainers = retireLocked(*operation, retired);
    retired.deliverFinish = tDrainOperationFinished;
    retired.operation = std::move(operation);
  }
  lock.unlock();
  tDrainCore = nullptr;
  settle(retired);
  launchDrainers(drainers);
}

std::vector<OperationPtr> QueueCore::operationsLocked() const {
  std::vector<OperationPtr> all;
  all.reserve(pending.size() + running.size());
  for (const SlotList* list : {&running, &pending}) {
    for (Operation* op = list->front(); op; op = SlotList::next(op)) all.push_back(op->slot_.held);
  }
  std::sort(all.begin(), all.end(), [](const OperationPtr& a, const OperationPtr& b) {
    return a->slot_.sequence < b->slot_.sequence;
  });
  return all;
}

bool QueueCore::allDoneLocked(const std::vector<OperationPtr>& operations) {
  return std::all_of(operations.begin(), operations.end(),
                     [](const OperationPtr& op) { return op->slot_.done; });
}

}  // namespace detail

OperationQueue::OperationQueue() : core_(std::make_shared<detail::QueueCore>()) {}

OperationQueue::~OperationQueue() = default;

void OperationQueue::addOperation(const OperationPtr& operation) { core_->add(operation); }

void OperationQueue::addOperations(const std::vector<OperationPtr>& operations,
                                   bool waitUntilFinished) {
  std::vector<OperationPtr> added;
  for (const auto& operation : operations) {
    if (core_->add(operation)) added.push_back(operation);
  }
  if (!waitUntilFinished || added.empty()) return;
  std::unique_lock lock(core_->mutex);
  ++core_->batchWaiters;
  core_->left.wait(lock, [&] { return detail::QueueCore::allDoneLocked(added); });
  --core_->batchWaiters;
}

void OperationQueue::addOperationWithBlock(std::function<void()> block) {
  addOperation(std::make_shared<BlockOperation>(std::move(block)));
}

void OperationQueue::cancelAllOperations() {
  for (const auto& operation : operations()) operation->cancel();
}

void OperationQueue::waitUntilAllOperationsAreFinished() {
  std::unique_lock lock(core_->mutex);
  ++core_->emptyWaiters;
  core_->left.wait(lock, [&] { return core_->pending.empty() && core_->running.empty(); });
  --core_->emptyWaiters;
}

std::int64_t OperationQueue::maxConcurrentOperationCount() const {
  std::lock_guard lock(core_->mutex);
  return core_->maxCount;
}

void OperationQueue::setMaxConcurrentOperationCount(std::int64_t count) {
  willChangeValueForKey("maxConcurrentOperationCount");
  std::size_t drainers = 0;
  {
    std::lock_guard lock(core_->mutex);
    core_->maxCount = count;
    drainers = core_->drainersNeededLocked();
  }
  core_->launchDrainers(drainers);
  didChangeValueForKey("maxConcurrentOperationCount");
}

std::string OperationQueue::name() const {
  std::lock_guard lock(core_->mutex);
  return core_->name;
}

void OperationQueue::setName(std::string name) {
  willChangeValueForKey("name");
  {
    std::lock_guard lock(core_->mutex);
    core_->name = std::move(name);
  }
  didChangeValueForKey("name");
}

std::vector<OperationPtr> OperationQueue::operations() const {
  std::lock_guard lock(core_->mutex);
  return core_->operationsLocked();
}

std::uint64_t OperationQueue::operationCount() const {
  std::lock_guard lock(core_->mutex);
  return core_->pending.size() + core_->running.size();
}

bool OperationQueue::isSuspended() const {
  std::lock_guard lock(core_->mutex);
  return core_->suspended;
}

void OperationQueue::setSuspended(bool suspended) {
  willChangeValueForKey("isSuspended");
  std::size_t drainers = 0;
  {
    std::lock_guard lock(core_->mutex);
    core_->suspended = suspended;
    drainers = core_->drainersNeededLocked();
  }
  core_->launchDrainers(drainers);
  didChangeValueForKey("isSuspended");
}

Value OperationQueue::valueForKey(std::string_view key) const {
  if (key == "name") return Value(name());
  if (key == "maxConcurrentOperationCount") return Value(maxConcurrentOperationCount());
  if (key == "operationCount") return Value(operationCount());
  if (key == "isSuspended") return Value(isSuspended());
  return Object::valueForKey(key);
}

}  // namespace kivi

#include "kivi/dispatch/operation_queue.h"

#include <algorithm>
#include <utility>

#include "kivi/dispatch/worker_pool.h"
#include "operation_internals.h"

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

void EntryList::insertBefore(QueueEntry* position, QueueEntry* entry) {
  QueueEntry* previous = position ? position->previous : tail_;
  entry->previous = previous;
  entry->next = position;
  (previous ? previous->next : head_) = entry;
  (position ? position->previous : tail_) = entry;
  ++size_;
}

void EntryList::remove(QueueEntry* entry) {
  (entry->previous ? entry->previous->next : head_) = entry->next;
  (entry->next ? entry->next->previous : tail_) = entry->previous;
  entry->previous = entry->next = nullptr;
  --size_;
}

QueueCore::~QueueCore() {
  // Only reached with both lists empty (keepAlive holds the core while it has
  // operations), but no operation may be left pointing at it.
  for (EntryList* list : {&pending, &running}) {
    while (QueueEntry* entry = list->front()) {
      list->remove(entry);
      OperationPtr operation = std::move(entry->operation);
      stateOf(*operation).entry = nullptr;
    }
  }
}

std::int64_t QueueCore::limitLocked() const {
  return maxCount < 0 ? OperationQueue::kDefaultConcurrency : maxCount;
}

bool QueueCore::add(const OperationPtr& operation) {
  if (!operation || operation->isFinished()) return false;
  OperationState& state = stateOf(*operation);
  if (state.enqueued.exchange(true)) return false;
  // The queue is known to the operation before the operation is listed, so
  // that a finish is never delivered to waiters before the queue lets go.
  {
    std::lock_guard lock(state.mutex);
    state.queue = weak_from_this();
  }
  const std::uint64_t epoch = ++state.readyEpoch;
  const bool ready = operation->isReady();
  std::size_t drainers = 0;
  {
    std::lock_guard lock(mutex);
    // Finished meanwhile (started by hand): its finish found no entry and
    // was delivered; there is nothing to list.
    if (state.finishHandled.load(std::memory_order_acquire)) return true;
    QueueEntry* entry = &state.queueEntry;
    *entry = QueueEntry{};
    entry->operation = operation;
    entry->sequence = nextSequence++;
    entry->ready = ready;
    entry->readyEpoch = epoch;
    state.entry = entry;
    pending.pushBack(entry);
    if (ready) ++readyPending;
    if (!keepAlive) keepAlive = shared_from_this();
    drainers = drainersNeededLocked();
  }
  launchDrainers(drainers);
  // Announcements made before the operation was listed did not reach us.
  if (state.readyEpoch.load() != epoch) readinessChanged(*operation);
  return true;
}

void QueueCore::readinessChanged(Operation& operation) {
  OperationState& state = stateOf(operation);
  const std::uint64_t epoch = ++state.readyEpoch;
  const bool ready = operation.isReady();
  std::size_t drainers = 0;
  {
    std::lock_guard lock(mutex);
    QueueEntry* entry = state.entry;
    if (!entry || entry->started || epoch <= entry->readyEpoch) return;
    entry->readyEpoch = epoch;
    if (entry->ready == ready) return;
    entry->ready = ready;
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
  OperationState& state = stateOf(operation);
  QueueEntry* entry = state.entry;
  if (!entry) return 0;
  state.entry = nullptr;
  if (entry->started) {
    running.remove(entry);
  } else {
    pending.remove(entry);
    if (entry->ready) --readyPending;
  }
  retired.held = std::move(entry->operation);
  const bool empty = pending.empty() && running.empty();
  if (empty) retired.keeper = std::move(keepAlive);
  if (batchWaiters || (emptyWaiters && empty)) left.notify_all();
  return drainersNeededLocked();
}

void QueueCore::requeueLocked(QueueEntry* entry) {
  running.remove(entry);
  entry->started = false;
  entry->ready = false;
  QueueEntry* position = pending.front();
  while (position && position->sequence < entry->sequence) position = position->next;
  pending.insertBefore(position, entry);
  stateOf(*entry->operation).queueStarted.store(false, std::memory_order_release);
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
    QueueEntry* entry = nullptr;
    if (!suspended && running.size() < static_cast<std::size_t>(limitLocked())) {
      for (QueueEntry* e = pending.front(); e; e = e->next) {
        if (e->ready) {
          entry = e;
          break;
        }
      }
    }
    --searching;
    if (!entry) break;
    --readyPending;
    pending.remove(entry);
    running.pushBack(entry);
    entry->started = true;
    OperationPtr operation = entry->operation;
    OperationState& state = stateOf(*operation);
    state.queueStarted.store(true, std::memory_order_release);
    lock.unlock();
    settle(retired);
    launchDrainers(std::exchange(drainers, 0));
    tDrainOperation = operation.get();
    tDrainOperationFinished = false;
    operation->start();
    tDrainOperation = nullptr;
    // A synchronous operation whose start() found it not ready after all (a
    // dependency was added after the queue picked it) goes back to wait.
    const bool refused = !tDrainOperationFinished &&
                         state.refusedNotReady.exchange(false, std::memory_order_acq_rel);
    lock.lock();
    ++searching;
    if (tDrainOperationFinished) {
      drainers = retireLocked(*operation, retired);
      retired.deliverFinish = true;
      retired.operation = std::move(operation);
    } else if (refused && state.entry == entry && entry->started) {
      requeueLocked(entry);
      lock.unlock();
      readinessChanged(*operation);
      operation = nullptr;
      lock.lock();
    }
  }
  lock.unlock();
  tDrainCore = nullptr;
  settle(retired);
  launchDrainers(drainers);
}

std::vector<OperationPtr> QueueCore::operationsLocked() const {
  std::vector<const QueueEntry*> entries;
  entries.reserve(pending.size() + running.size());
  for (const EntryList* list : {&running, &pending}) {
    for (const QueueEntry* e = list->front(); e; e = e->next) entries.push_back(e);
  }
  std::sort(entries.begin(), entries.end(),
            [](const QueueEntry* a, const QueueEntry* b) { return a->sequence < b->sequence; });
  std::vector<OperationPtr> all;
  all.reserve(entries.size());
  for (const QueueEntry* e : entries) all.push_back(e->operation);
  return all;
}

bool QueueCore::allDoneLocked(const std::vector<OperationPtr>& operations) {
  return std::all_of(operations.begin(), operations.end(),
                     [](const OperationPtr& op) { return stateOf(*op).entry == nullptr; });
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
  WorkerPool::BlockingScope blocking;
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
  WorkerPool::BlockingScope blocking;
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

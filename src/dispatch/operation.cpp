#include "kivi/dispatch/operation.h"

#include <algorithm>
#include <new>

#include "kivi/dispatch/worker_pool.h"
#include "operation_internals.h"

namespace kivi {

static_assert(sizeof(detail::OperationState) <= detail::kOperationStateSize);
static_assert(alignof(detail::OperationState) <= 16);

Operation::Operation() { new (state_) detail::OperationState(); }

Operation::~Operation() { state().~OperationState(); }

detail::OperationState& Operation::state() const noexcept {
  return *std::launder(reinterpret_cast<detail::OperationState*>(state_));
}

void Operation::start() {
  if (isAsynchronous()) return;
  if (isFinished() || isExecuting()) return;
  const bool cancelled = isCancelled();
  if (!cancelled && !isReady()) {
    state().refusedNotReady.store(true, std::memory_order_release);
    return;
  }
  if (state().baseStarted.exchange(true)) return;
  auto self = weak_from_this().lock();
  if (!cancelled) {
    willChangeValueForKey("isExecuting");
    state().baseExecuting = true;
    didChangeValueForKey("isExecuting");
    main();
  }
  willChangeValueForKey("isExecuting");
  willChangeValueForKey("isFinished");
  state().baseExecuting = false;
  state().baseFinished = true;
  didChangeValueForKey("isFinished");
  didChangeValueForKey("isExecuting");
}

void Operation::main() {}

void Operation::cancel() {
  if (state().cancelAnnounced.exchange(true)) return;
  auto self = weak_from_this().lock();
  willChangeValueForKey("isCancelled");
  state().cancelled = true;
  didChangeValueForKey("isCancelled");
  if (!isFinished()) {
    willChangeValueForKey("isReady");
    didChangeValueForKey("isReady");
  }
}

bool Operation::isCancelled() const { return state().cancelled; }
bool Operation::isExecuting() const { return state().baseExecuting; }
bool Operation::isFinished() const { return state().baseFinished; }
bool Operation::isAsynchronous() const { return false; }

bool Operation::isReady() const {
  if (isCancelled()) return true;
  if (state().dependencyCount.load(std::memory_order_acquire) == 0) return true;
  std::vector<OperationPtr> dependencies;
  {
    std::lock_guard lock(state().mutex);
    if (state().dependencies.empty()) return true;
    dependencies = state().dependencies;
  }
  return std::all_of(dependencies.begin(), dependencies.end(),
                     [](const OperationPtr& d) { return d->isFinished(); });
}

void Operation::addDependency(const OperationPtr& operation) {
  if (!operation || operation.get() == this) return;
  {
    std::lock_guard lock(state().mutex);
    if (std::find(state().dependencies.begin(), state().dependencies.end(), operation) !=
        state().dependencies.end()) {
      return;
    }
  }
  auto self = weak_from_this().lock();
  willChangeValueForKey("isReady");
  {
    std::lock_guard lock(state().mutex);
    state().dependencies.push_back(operation);
    state().dependencyCount.store(state().dependencies.size(), std::memory_order_release);
  }
  if (self) {
    std::lock_guard lock(operation->state().mutex);
    operation->state().dependents.push_back(std::static_pointer_cast<Operation>(self));
  }
  didChangeValueForKey("isReady");
}

void Operation::removeDependency(const OperationPtr& operation) {
  if (!operation) return;
  auto self = weak_from_this().lock();
  willChangeValueForKey("isReady");
  {
    std::lock_guard lock(state().mutex);
    std::erase(state().dependencies, operation);
    state().dependencyCount.store(state().dependencies.size(), std::memory_order_release);
  }
  {
    std::lock_guard lock(operation->state().mutex);
    std::erase_if(operation->state().dependents, [this](const std::weak_ptr<Operation>& w) {
      auto op = w.lock();
      return !op || op.get() == this;
    });
  }
  didChangeValueForKey("isReady");
}

std::vector<OperationPtr> Operation::dependencies() const {
  std::lock_guard lock(state().mutex);
  return state().dependencies;
}

std::function<void()> Operation::completionBlock() const {
  std::lock_guard lock(state().mutex);
  return state().completionBlock;
}

void Operation::setCompletionBlock(std::function<void()> block) {
  std::lock_guard lock(state().mutex);
  state().completionBlock = std::move(block);
}

std::string Operation::name() const {
  std::lock_guard lock(state().mutex);
  return state().name;
}

void Operation::setName(std::string name) {
  willChangeValueForKey("name");
  {
    std::lock_guard lock(state().mutex);
    state().name = std::move(name);
  }
  didChangeValueForKey("name");
}

void Operation::waitUntilFinished() {
  if (state().finishDelivered.isSet()) return;
  // A futex of this operation's own: finishing wakes only its waiters.
  WorkerPool::BlockingScope blocking;
  state().finishDelivered.wait();
}

Value Operation::valueForKey(std::string_view key) const {
  if (key == "isReady") return Value(isReady());
  if (key == "isExecuting") return Value(isExecuting());
  if (key == "isFinished") return Value(isFinished());
  if (key == "isCancelled") return Value(isCancelled());
  if (key == "isAsynchronous") return Value(isAsynchronous());
  if (key == "isConcurrent") return Value(isConcurrent());
  if (key == "name") return Value(name());
  return Object::valueForKey(key);
}

namespace {
std::shared_ptr<detail::QueueCore> queueOf(const detail::OperationState& state) {
  std::lock_guard lock(state.mutex);
  return state.queue.lock();
}
}  // namespace

void Operation::keyValueDidChange(std::string_view key) {
  if (key == "isFinished") {
    if (isFinished()) didFinish();
  } else if (key == "isReady") {
    if (state().queueStarted.load(std::memory_order_acquire)) return;
    if (auto core = queueOf(state())) {
      core->readinessChanged(*this);
    } else {
      state().readyEpoch.fetch_add(1);  // seen by a queue that is adding us right now
    }
  }
}

void Operation::didFinish() {
  if (state().finishHandled.exchange(true)) return;
  auto self = weak_from_this().lock();
  std::vector<std::weak_ptr<Operation>> dependents;
  std::function<void()> completion;
  std::shared_ptr<detail::QueueCore> core;
  {
    std::lock_guard lock(state().mutex);
    dependents.swap(state().dependents);
    completion = std::move(state().completionBlock);
    state().completionBlock = nullptr;
    core = state().queue.lock();
  }
  for (const auto& weakDependent : dependents) {
    if (auto dependent = weakDependent.lock()) {
      dependent->willChangeValueForKey("isReady");
      dependent->didChangeValueForKey("isReady");
    }
  }
  if (completion) WorkerPool::shared().submit(std::move(completion));
  if (!core || core->operationFinished(*this)) deliverFinish();
}

void Operation::deliverFinish() { state().finishDelivered.set(); }

void BlockOperation::main() {
  if (block_) block_();
}

}  // namespace kivi

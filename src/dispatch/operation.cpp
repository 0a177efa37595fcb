#include "kivi/dispatch/operation.h"

#include <algorithm>

#include "kivi/dispatch/worker_pool.h"
#include "queue_core.h"

namespace kivi {

Operation::~Operation() = default;

void Operation::start() {
  if (isAsynchronous()) return;
  if (isFinished() || isExecuting()) return;
  const bool cancelled = isCancelled();
  if (!cancelled && !isReady()) return;
  if (baseStarted_.exchange(true)) return;
  auto self = weak_from_this().lock();
  if (!cancelled) {
    willChangeValueForKey("isExecuting");
    baseExecuting_ = true;
    didChangeValueForKey("isExecuting");
    main();
  }
  willChangeValueForKey("isExecuting");
  willChangeValueForKey("isFinished");
  baseExecuting_ = false;
  baseFinished_ = true;
  didChangeValueForKey("isFinished");
  didChangeValueForKey("isExecuting");
}

void Operation::main() {}

void Operation::cancel() {
  if (cancelAnnounced_.exchange(true)) return;
  auto self = weak_from_this().lock();
  willChangeValueForKey("isCancelled");
  cancelled_ = true;
  didChangeValueForKey("isCancelled");
  if (!isFinished()) {
    willChangeValueForKey("isReady");
    didChangeValueForKey("isReady");
  }
}

bool Operation::isCancelled() const { return cancelled_; }
bool Operation::isExecuting() const { return baseExecuting_; }
bool Operation::isFinished() const { return baseFinished_; }
bool Operation::isAsynchronous() const { return false; }

bool Operation::isReady() const {
  if (isCancelled()) return true;
  if (dependencyCount_.load(std::memory_order_acquire) == 0) return true;
  std::vector<OperationPtr> dependencies;
  {
    std::lock_guard lock(mutex_);
    if (dependencies_.empty()) return true;
    dependencies = dependencies_;
  }
  return std::all_of(dependencies.begin(), dependencies.end(),
                     [](const OperationPtr& d) { return d->isFinished(); });
}

void Operation::addDependency(const OperationPtr& operation) {
  if (!operation || operation.get() == this) return;
  {
    std::lock_guard lock(mutex_);
    if (std::find(dependencies_.begin(), dependencies_.end(), operation) != dependencies_.end()) {
      return;
    }
  }
  auto self = weak_from_this().lock();
  willChangeValueForKey("isReady");
  {
    std::lock_guard lock(mutex_);
    dependencies_.push_back(operation);
    dependencyCount_.store(dependencies_.size(), std::memory_order_release);
  }
  if (self) {
    std::lock_guard lock(operation->mutex_);
    operation->dependents_.push_back(std::static_pointer_cast<Operation>(self));
  }
  didChangeValueForKey("isReady");
}

void Operation::removeDependency(const OperationPtr& operation) {
  if (!operation) return;
  auto self = weak_from_this().lock();
  willChangeValueForKey("isReady");
  {
    std::lock_guard lock(mutex_);
    std::erase(dependencies_, operation);
    dependencyCount_.store(dependencies_.size(), std::memory_order_release);
  }
  {
    std::lock_guard lock(operation->mutex_);
    std::erase_if(operation->dependents_, [this](const std::weak_ptr<Operation>& w) {
      auto op = w.lock();
      return !op || op.get() == this;
    });
  }
  didChangeValueForKey("isReady");
}

std::vector<OperationPtr> Operation::dependencies() const {
  std::lock_guard lock(mutex_);
  return dependencies_;
}

std::function<void()> Operation::completionBlock() const {
  std::lock_guard lock(mutex_);
  return completionBlock_;
}

void Operation::setCompletionBlock(std::function<void()> block) {
  std::lock_guard lock(mutex_);
  completionBlock_ = std::move(block);
}

std::string Operation::name() const {
  std::lock_guard lock(mutex_);
  return name_;
}

void Operation::setName(std::string name) {
  willChangeValueForKey("name");
  {
    std::lock_guard lock(mutex_);
    name_ = std::move(name);
  }
  didChangeValueForKey("name");
}

void Operation::waitUntilFinished() {
  // A futex of this operation's own: finishing wakes only its waiters.
  finishDelivered_.wait(false, std::memory_order_acquire);
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

std::shared_ptr<detail::QueueCore> Operation::queueCore() const {
  std::lock_guard lock(mutex_);
  return queue_.lock();
}

void Operation::keyValueDidChange(std::string_view key) {
  if (key == "isFinished") {
    if (isFinished()) didFinish();
  } else if (key == "isReady") {
    if (queueStarted_.load(std::memory_order_acquire)) return;
    if (auto core = queueCore()) {
      core->readinessChanged(*this);
    } else {
      readyEpoch_.fetch_add(1);  // seen by a queue that is adding us right now
    }
  }
}

void Operation::didFinish() {
  if (finishHandled_.exchange(true)) return;
  auto self = weak_from_this().lock();
  std::vector<std::weak_ptr<Operation>> dependents;
  std::function<void()> completion;
  std::shared_ptr<detail::QueueCore> core;
  {
    std::lock_guard lock(mutex_);
    dependents.swap(dependents_);
    completion = std::move(completionBlock_);
    completionBlock_ = nullptr;
    core = queue_.lock();
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

void Operation::deliverFinish() {
  finishDelivered_.store(true, std::memory_order_release);
  finishDelivered_.notify_all();
}

void BlockOperation::main() {
  if (block_) block_();
}

}  // namespace kivi

#include "kivi/timing/kiv_key_value_observer.h"

#include <mutex>

#include "kivi/dispatch/dispatch_queue.h"

namespace kivi {

struct KivKeyValueObserver::State {
  std::recursive_mutex mutex;
  bool isObserverAdded = false;
  std::string keyPath;
  std::shared_ptr<Object> target;
  OnChangeBlock onChangeBlock;
  std::shared_ptr<KivDispatchQueueProtocol> onChangeQueue;
  // The registration's context: the object model removes an observation
  // only by the context it was added with.
  void* context = nullptr;
};

KivKeyValueObserver::KivKeyValueObserver(std::shared_ptr<Object> target, std::string keyPath)
    : state_(std::make_unique<State>()) {
  state_->target = std::move(target);
  state_->keyPath = std::move(keyPath);
}

std::shared_ptr<KivKeyValueObserver> KivKeyValueObserver::create(std::shared_ptr<Object> target,
                                                                 std::string keyPath) {
  return std::make_shared<KivKeyValueObserver>(std::move(target), std::move(keyPath));
}

KivKeyValueObserver::~KivKeyValueObserver() {
  // No shared_from_this() here any more; removal goes by address.
  if (state_->isObserverAdded) {
    state_->target->removeObserver(this, state_->keyPath, state_->context);
  }
}

void KivKeyValueObserver::registerObserverWithOptions(
    KeyValueObservingOptions options, OnChangeBlock onChangeBlock,
    std::shared_ptr<KivDispatchQueueProtocol> onChangeQueue, void* context) {
  std::lock_guard lock(state_->mutex);
  state_->onChangeQueue = onChangeQueue
                              ? std::move(onChangeQueue)
                              : DispatchQueue::global(DispatchQoS::QoSClass::userInteractive);
  state_->onChangeBlock = std::move(onChangeBlock);
  if (state_->isObserverAdded || !state_->target) return;
  auto self = weak_from_this().lock();
  if (!self) return;
  state_->isObserverAdded = true;
  state_->context = context;
  // With the Initial option the first change arrives from in here, on this
  // thread, and takes the (recursive) lock again.
  state_->target->addObserver(self, state_->keyPath, options, context);
}

void KivKeyValueObserver::observeValueForKeyPath(std::string_view, Object*,
                                                 const Dictionary& change, void* context) {
  OnChangeBlock block;
  std::shared_ptr<KivDispatchQueueProtocol> queue;
  {
    std::lock_guard lock(state_->mutex);
    if (!state_->onChangeBlock || !state_->onChangeQueue) return;
    block = state_->onChangeBlock;
    queue = state_->onChangeQueue;
  }
  const auto oldValue = change.find(KeyValueChangeOldKey);
  const auto newValue = change.find(KeyValueChangeNewKey);
  queue->async([block = std::move(block),
                before = oldValue == change.end() ? Value() : oldValue->second,
                after = newValue == change.end() ? Value() : newValue->second,
                context] { block(before, after, context); });
}

bool KivKeyValueObserver::isObserverAdded() const {
  std::lock_guard lock(state_->mutex);
  return state_->isObserverAdded;
}

std::string KivKeyValueObserver::keyPath() const {
  std::lock_guard lock(state_->mutex);
  return state_->keyPath;
}

std::shared_ptr<Object> KivKeyValueObserver::target() const {
  std::lock_guard lock(state_->mutex);
  return state_->target;
}

KivKeyValueObserver::OnChangeBlock KivKeyValueObserver::onChangeBlock() const {
  std::lock_guard lock(state_->mutex);
  return state_->onChangeBlock;
}

void KivKeyValueObserver::setOnChangeBlock(OnChangeBlock onChangeBlock) {
  std::lock_guard lock(state_->mutex);
  state_->onChangeBlock = std::move(onChangeBlock);
}

std::shared_ptr<KivDispatchQueueProtocol> KivKeyValueObserver::onChangeQueue() const {
  std::lock_guard lock(state_->mutex);
  return state_->onChangeQueue;
}

void KivKeyValueObserver::setOnChangeQueue(
    std::shared_ptr<KivDispatchQueueProtocol> onChangeQueue) {
  std::lock_guard lock(state_->mutex);
  state_->onChangeQueue = std::move(onChangeQueue);
}

}  // namespace kivi

// KivKeyValueObserver: watches one key path of one object and hands each
// change, as (old value, new value, context), to a callback on a queue of the
// caller's choice.
//
//   auto observer = kivi::KivKeyValueObserver::create(operation, "isFinished");
//   observer->registerObserverWithOptions(
//       kivi::KeyValueObservingOptionNew | kivi::KeyValueObservingOptionOld,
//       [](const kivi::Value& before, const kivi::Value& after, void*) { ... },
//       kivi::DispatchQueue::main(), nullptr);
//   // ... observing until the last reference to `observer` goes.
//
// The observer keeps its target alive; the target holds the observer weakly,
// so the observer lives as long as its owner keeps it. The first
// registration adds the observation with its options and context; a later
// one replaces only the callback and the queue. Without a queue the callback
// runs on the global user-interactive queue, where callbacks for successive
// changes may overlap and arrive out of order; choose a serial queue for
// order. A change that arrives while no callback is set is dropped; an
// absent old or new value (an option not asked for) reaches the callback as
// the null Value. A change that finds no queue (setOnChangeQueue(nullptr))
// is dropped too. The key path and object of a notification are not checked
// against the observer's own.
//
// There is no way to stop observing other than releasing the observer: its
// destruction removes the observation it added. Registration needs the
// observer to be owned by a std::shared_ptr (create() or std::make_shared);
// without one, or without a target, it sets the callback and the queue and
// observes nothing.
//
// Thread contract: every member from any thread. Registration, change
// forwarding and the accessors serialise on the observer's own recursive
// lock (a change delivered while registering, with the Initial option, comes
// back in on the same thread). The callback runs outside that lock, on the
// queue.
#pragma once

#include <functional>
#include <memory>
#include <string>
#include <string_view>

#include "kivi/base/object.h"
#include "kivi/base/value.h"
#include "kivi/dispatch/kiv_dispatch_queue_protocol.h"
#include "kivi/export.h"

namespace kivi {

class KIVI_EXPORT KivKeyValueObserver : public Object {
 public:
  // The callback: the old and the new value (the null Value when not asked for) and the
  // context given at registration.
  using OnChangeBlock =
      std::function<void(const Value& oldValue, const Value& newValue, void* context)>;

  // initWithTarget:keyPath: — keeps the target, observes nothing yet.
  KivKeyValueObserver(std::shared_ptr<Object> target, std::string keyPath);
  [[nodiscard]] static std::shared_ptr<KivKeyValueObserver> create(std::shared_ptr<Object> target,
                                                                   std::string keyPath);
  // Removes the observation, if one was added.
  ~KivKeyValueObserver() override;

  // `options` are those of Object::addObserver; a null queue stands for the
  // global user-interactive queue.
  void registerObserverWithOptions(KeyValueObservingOptions options, OnChangeBlock onChangeBlock,
                                   std::shared_ptr<KivDispatchQueueProtocol> onChangeQueue,
                                   void* context);

  // The entry point of key-value notifications: forwards the change.
  void observeValueForKeyPath(std::string_view keyPath, Object* object, const Dictionary& change,
                              void* context) override;

  // Whether a registration has added the observation; it stays until the observer goes.
  bool isObserverAdded() const;
  // The key path and the target given at creation.
  std::string keyPath() const;
  std::shared_ptr<Object> target() const;
  // The callback; empty until a registration or setOnChangeBlock() sets it.
  OnChangeBlock onChangeBlock() const;
  void setOnChangeBlock(OnChangeBlock onChangeBlock);
  // The queue the callback runs on; null until a registration sets it. Unlike registration,
  // setOnChangeQueue(nullptr) leaves no queue, and changes are then dropped.
  std::shared_ptr<KivDispatchQueueProtocol> onChangeQueue() const;
  void setOnChangeQueue(std::shared_ptr<KivDispatchQueueProtocol> onChangeQueue);

 private:
  struct State;
  std::unique_ptr<State> state_;
};

}  // namespace kivi

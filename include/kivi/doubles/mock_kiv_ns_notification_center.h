// MockKivNSNotificationCenter: a scriptable KivNSNotificationCenterProtocol.
//
// Every operation calls its callback, if set, with the arguments unchanged
// and answers what it answers. Without callbacks nothing is registered or
// delivered, and addObserverForName() answers a new plain object as the
// observer token (its block is never called).
//
//   auto center = std::make_shared<kivi::MockKivNSNotificationCenter>();
//   std::vector<std::string> posted;
//   center->postNotificationNameObjectUserInfoBlock =
//       [&](const std::string& name, const kivi::ObjectPtr&, const kivi::Dictionary&) {
//         posted.push_back(name);
//       };
//   session.setNotificationCenter(center);
//
// Thread contract: none; callbacks run synchronously on the calling thread.
// Set the callbacks before handing the double out.
#pragma once

#include <functional>
#include <memory>
#include <string>

#include "kivi/export.h"
#include "kivi/platform/kiv_ns_notification_center_protocol.h"

namespace kivi {

class KIVI_EXPORT MockKivNSNotificationCenter : public Object,
                                                public KivNSNotificationCenterProtocol {
 public:
  MockKivNSNotificationCenter() = default;

  // Called by addObserver(observer, selector, name, object); without it nothing is registered.
  std::function<void(const ObjectPtr&, const Selector&, const NSNotificationName&,
                     const ObjectPtr&)>
      addObserverBlock;
  // Answers addObserverForName(name, object, queue, block); without it, a new NSObject as the token
  // (the block is never called).
  std::function<ObjectPtr(const NSNotificationName&, const ObjectPtr&,
                          const std::shared_ptr<OperationQueue>&,
                          std::function<void(const NSNotificationPtr&)>)>
      addObserverForNameBlock;
  // Called by postNotification(notification); without it nothing is delivered.
  std::function<void(const NSNotificationPtr&)> postNotificationBlock;
  // Called by postNotificationName(name, object); without it nothing is delivered.
  std::function<void(const NSNotificationName&, const ObjectPtr&)> postNotificationNameObjectBlock;
  // Called by postNotificationName(name, object, userInfo); without it nothing is delivered.
  std::function<void(const NSNotificationName&, const ObjectPtr&, const Dictionary&)>
      postNotificationNameObjectUserInfoBlock;
  // Called by removeObserver(observer); without it nothing happens.
  std::function<void(const ObjectPtr&)> removeObserverBlock;
  // Called by removeObserver(observer, name, object); without it nothing happens.
  std::function<void(const ObjectPtr&, const NSNotificationName&, const ObjectPtr&)>
      removeObserverNameObjectBlock;

  std::string description() const override { return Object::description(); }

  // Object's own key-value observer members stay reachable.
  using Object::addObserver;
  using Object::removeObserver;

  void addObserver(const ObjectPtr& observer, const Selector& selector,
                   const NSNotificationName& name, const ObjectPtr& object) override {
    if (addObserverBlock) addObserverBlock(observer, selector, name, object);
  }
  ObjectPtr addObserverForName(const NSNotificationName& name, const ObjectPtr& object,
                               const std::shared_ptr<OperationQueue>& queue,
                               std::function<void(const NSNotificationPtr&)> block) override {
    if (addObserverForNameBlock) {
      return addObserverForNameBlock(name, object, queue, std::move(block));
    }
    return std::make_shared<NSObject>();
  }
  void postNotification(const NSNotificationPtr& notification) override {
    if (postNotificationBlock) postNotificationBlock(notification);
  }
  void postNotificationName(const NSNotificationName& name, const ObjectPtr& object) override {
    if (postNotificationNameObjectBlock) postNotificationNameObjectBlock(name, object);
  }
  void postNotificationName(const NSNotificationName& name, const ObjectPtr& object,
                            const Dictionary& userInfo) override {
    if (postNotificationNameObjectUserInfoBlock) {
      postNotificationNameObjectUserInfoBlock(name, object, userInfo);
    }
  }
  void removeObserver(const ObjectPtr& observer) override {
    if (removeObserverBlock) removeObserverBlock(observer);
  }
  void removeObserver(const ObjectPtr& observer, const NSNotificationName& name,
                      const ObjectPtr& object) override {
    if (removeObserverNameObjectBlock) removeObserverNameObjectBlock(observer, name, object);
  }
};

}  // namespace kivi

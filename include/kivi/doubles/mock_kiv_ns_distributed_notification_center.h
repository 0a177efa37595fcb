// MockKivNSDistributedNotificationCenter: a scriptable
// KivNSDistributedNotificationCenterProtocol. It is a
// MockKivNSNotificationCenter too (the same callbacks for the in-process
// operations), with its own callbacks for the distributed ones.
//
// Two operations exist in both interfaces: addObserver(observer, selector,
// name, object) and removeObserver(observer, name, object). On this double
// its own callbacks answer both forms: addDistributedNotificationObserverBlock
// and removeDistributedNotificationObserverBlock, never the inherited
// addObserverBlock and removeObserverNameObjectBlock. Reached through the
// in-process form, the object arrives as a string: empty for null, else the
// object's description().
//
//   auto center = std::make_shared<kivi::MockKivNSDistributedNotificationCenter>();
//   center->postNotificationImmediatelyBlock =
//       [&](const std::string& name, const std::string&, const kivi::Dictionary&, bool) {
//         pinged.push_back(name);
//       };
//   agent.setDistributedCenter(center);
//
// Thread contract: none; callbacks run synchronously on the calling thread.
// Set the callbacks before handing the double out.
#pragma once

#include <functional>
#include <string>

#include "kivi/doubles/mock_kiv_ns_notification_center.h"
#include "kivi/export.h"
#include "kivi/platform/kiv_ns_distributed_notification_center_protocol.h"

namespace kivi {

class KIVI_EXPORT MockKivNSDistributedNotificationCenter
    : public MockKivNSNotificationCenter,
      public KivNSDistributedNotificationCenterProtocol {
 public:
  MockKivNSDistributedNotificationCenter() = default;

  // Called by postNotificationName(name, object, userInfo, deliverImmediately); without it nothing
  // is posted.
  std::function<void(const NSNotificationName&, const std::string&, const Dictionary&, bool)>
      postNotificationImmediatelyBlock;
  // Called by postNotificationName(name, object, userInfo, options); without it nothing is posted.
  std::function<void(const NSNotificationName&, const std::string&, const Dictionary&,
                     NSDistributedNotificationOptions)>
      postNotificationWithOptionsBlock;
  // Called by addObserver(observer, selector, name, object, suspensionBehavior); without it nothing
  // is registered.
  std::function<void(const ObjectPtr&, const Selector&, const NSNotificationName&,
                     const std::string&, NSNotificationSuspensionBehavior)>
      addDistributedNotificationSuspensionBehaviourObserverBlock;
  // Called by addObserver(observer, selector, name, object), in both forms; without it nothing is
  // registered.
  std::function<void(const ObjectPtr&, const Selector&, const NSNotificationName&,
                     const std::string&)>
      addDistributedNotificationObserverBlock;
  // Called by removeObserver(observer, name, object), in both forms; without it nothing happens.
  std::function<void(const ObjectPtr&, const NSNotificationName&, const std::string&)>
      removeDistributedNotificationObserverBlock;

  std::string description() const override { return Object::description(); }

  // The in-process operations stay reachable beside the distributed ones.
  using MockKivNSNotificationCenter::addObserver;
  using MockKivNSNotificationCenter::postNotificationName;
  using MockKivNSNotificationCenter::removeObserver;

  void postNotificationName(const NSNotificationName& name, const std::string& object,
                            const Dictionary& userInfo, bool deliverImmediately) override {
    if (postNotificationImmediatelyBlock) {
      postNotificationImmediatelyBlock(name, object, userInfo, deliverImmediately);
    }
  }
  void postNotificationName(const NSNotificationName& name, const std::string& object,
                            const Dictionary& userInfo,
                            NSDistributedNotificationOptions options) override {
    if (postNotificationWithOptionsBlock) {
      postNotificationWithOptionsBlock(name, object, userInfo, options);
    }
  }
  void addObserver(const ObjectPtr& observer, const Selector& selector,
                   const NSNotificationName& name, const std::string& object,
                   NSNotificationSuspensionBehavior suspensionBehavior) override {
    if (addDistributedNotificationSuspensionBehaviourObserverBlock) {
      addDistributedNotificationSuspensionBehaviourObserverBlock(observer, selector, name, object,
                                                                 suspensionBehavior);
    }
  }
  void addObserver(const ObjectPtr& observer, const Selector& selector,
                   const NSNotificationName& name, const std::string& object) override {
    if (addDistributedNotificationObserverBlock) {
      addDistributedNotificationObserverBlock(observer, selector, name, object);
    }
  }
  void removeObserver(const ObjectPtr& observer, const NSNotificationName& name,
                      const std::string& object) override {
    if (removeDistributedNotificationObserverBlock) {
      removeDistributedNotificationObserverBlock(observer, name, object);
    }
  }

  // The in-process form: goes to addDistributedNotificationObserverBlock, the
  // object as a string ("" for null, else its description()).
  void addObserver(const ObjectPtr& observer, const Selector& selector,
                   const NSNotificationName& name, const ObjectPtr& object) override {
    addObserver(observer, selector, name, objectName(object));
  }
  // The in-process form: goes to removeDistributedNotificationObserverBlock,
  // the object as a string ("" for null, else its description()).
  void removeObserver(const ObjectPtr& observer, const NSNotificationName& name,
                      const ObjectPtr& object) override {
    removeObserver(observer, name, objectName(object));
  }

 private:
  static std::string objectName(const ObjectPtr& object) {
    return object ? object->description() : std::string();
  }
};

}  // namespace kivi

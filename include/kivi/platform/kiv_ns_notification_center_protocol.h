// KivNSNotificationCenterProtocol: posting notifications inside the process
// and observing them, either by a target and selector or by a callback.
//
// The library implements it only by its double, MockKivNSNotificationCenter;
// a host implements it over its own notification bus.
//
//   auto token = center->addObserverForName(
//       "SessionDidEnd", nullptr, nullptr,
//       [](const kivi::NSNotificationPtr& n) { cleanUp(n->userInfo()); });
//   center->postNotificationName("SessionDidEnd", nullptr, {{"reason", "timeout"}});
//   center->removeObserver(token);
//
// Thread contract: that of the implementation; the platform's center may be
// called from any thread and delivers on the posting thread (or on the
// observer's queue when one was given).
#pragma once

#include <functional>
#include <memory>
#include <string>

#include "kivi/dispatch/operation_queue.h"
#include "kivi/export.h"
#include "kivi/platform/platform_types.h"

namespace kivi {

// The name a notification is posted and observed under.
using NSNotificationName = std::string;

class KIVI_EXPORT KivNSNotificationCenterProtocol {
 public:
  virtual ~KivNSNotificationCenterProtocol() = default;

  // The base object interface.
  virtual std::string description() const = 0;

  // Calls `selector` on `observer` with each notification named `name` about
  // `object` (null: about any object).
  virtual void addObserver(const ObjectPtr& observer, const Selector& selector,
                           const NSNotificationName& name, const ObjectPtr& object) = 0;
  // Calls `block` with each notification named `name` about `object`, on
  // `queue` (null: the posting thread). Answers the observer token to remove.
  virtual ObjectPtr addObserverForName(const NSNotificationName& name, const ObjectPtr& object,
                                       const std::shared_ptr<OperationQueue>& queue,
                                       std::function<void(const NSNotificationPtr&)> block) = 0;
  // Delivers `notification` to every observer registered for it.
  virtual void postNotification(const NSNotificationPtr& notification) = 0;
  // Posts a new notification named `name` about `object` (null for none),
  // with `userInfo` (empty when not given).
  virtual void postNotificationName(const NSNotificationName& name, const ObjectPtr& object) = 0;
  virtual void postNotificationName(const NSNotificationName& name, const ObjectPtr& object,
                                    const Dictionary& userInfo) = 0;
  // Removes every registration of `observer`: an object that was given a
  // selector, or a token addObserverForName() answered.
  virtual void removeObserver(const ObjectPtr& observer) = 0;
  // Removes the registrations of `observer` for the notifications named
  // `name` about `object` (null: about any object).
  virtual void removeObserver(const ObjectPtr& observer, const NSNotificationName& name,
                              const ObjectPtr& object) = 0;
};

}  // namespace kivi

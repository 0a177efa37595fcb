// KivNSDistributedNotificationCenterProtocol: notifications between
// processes of the same user session. The object a notification is about is
// a string (the sender's identifier) here, since it crosses processes.
//
// The library implements it only by its double,
// MockKivNSDistributedNotificationCenter; a host implements it over its
// session bus.
//
//   center->addObserver(watcher, kivi::Selector{"themeChanged", onTheme},
//                       "AppleInterfaceThemeChangedNotification", "",
//                       kivi::NSNotificationSuspensionBehaviorCoalesce);
//   center->postNotificationName("com.example.ping", "com.example.agent", {}, true);
//
// Thread contract: that of the implementation.
#pragma once

#include <cstdint>
#include <string>

#include "kivi/export.h"
#include "kivi/platform/kiv_ns_notification_center_protocol.h"

namespace kivi {

// What happens to a notification while its observer's application is
// suspended.
using NSNotificationSuspensionBehavior = std::uint64_t;
inline constexpr NSNotificationSuspensionBehavior NSNotificationSuspensionBehaviorDrop = 1;
inline constexpr NSNotificationSuspensionBehavior NSNotificationSuspensionBehaviorCoalesce = 2;
inline constexpr NSNotificationSuspensionBehavior NSNotificationSuspensionBehaviorHold = 3;
inline constexpr NSNotificationSuspensionBehavior
    NSNotificationSuspensionBehaviorDeliverImmediately = 4;

// Options of postNotificationName(name, object, userInfo, options).
using NSDistributedNotificationOptions = std::uint64_t;
inline constexpr NSDistributedNotificationOptions NSDistributedNotificationDeliverImmediately = 1;
inline constexpr NSDistributedNotificationOptions NSDistributedNotificationPostToAllSessions = 2;

class KIVI_EXPORT KivNSDistributedNotificationCenterProtocol {
 public:
  virtual ~KivNSDistributedNotificationCenterProtocol() = default;

  // The base object interface.
  virtual std::string description() const = 0;

  // Posts a notification named `name` from the sender `object` to the
  // session's observers; `deliverImmediately` reaches suspended observers at
  // once, whatever their suspension behaviour.
  virtual void postNotificationName(const NSNotificationName& name, const std::string& object,
                                    const Dictionary& userInfo, bool deliverImmediately) = 0;
  // The same with NSDistributedNotificationOptions bits.
  virtual void postNotificationName(const NSNotificationName& name, const std::string& object,
                                    const Dictionary& userInfo,
                                    NSDistributedNotificationOptions options) = 0;
  // Calls `selector` on `observer` with each notification named `name` from
  // the sender `object` ("" for any sender); `suspensionBehavior` decides
  // what happens to those posted while the application is suspended.
  virtual void addObserver(const ObjectPtr& observer, const Selector& selector,
                           const NSNotificationName& name, const std::string& object,
                           NSNotificationSuspensionBehavior suspensionBehavior) = 0;
  // The same with NSNotificationSuspensionBehaviorCoalesce.
  virtual void addObserver(const ObjectPtr& observer, const Selector& selector,
                           const NSNotificationName& name, const std::string& object) = 0;
  // Stops delivering the notifications named `name` from `object` to
  // `observer`.
  virtual void removeObserver(const ObjectPtr& observer, const NSNotificationName& name,
                              const std::string& object) = 0;
};

}  // namespace kivi

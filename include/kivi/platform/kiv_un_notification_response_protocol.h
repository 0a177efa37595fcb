// KivUNNotificationResponseProtocol: the user's answer to a notification:
// which notification, and which of its actions was chosen
// (UNNotificationDefaultActionIdentifier for a plain click). Both can be set
// too, so that a test can build one.
//
// The library implements it only by its double, MockUNNotificationResponse
// (kivi::UNNotificationResponse answers the same reads).
//
//   if (response.actionIdentifier() == "snooze") snooze(response.notification());
//
// Thread contract: that of the implementation; the double is a plain value
// holder.
//
// The text-input response's interface inherits this one virtually, so that
// one class can implement both.
#pragma once

#include <memory>
#include <string>

#include "kivi/desktop/user_notifications.h"
#include "kivi/export.h"

namespace kivi {

class KIVI_EXPORT KivUNNotificationResponseProtocol {
 public:
  virtual ~KivUNNotificationResponseProtocol() = default;

  // The base object interface.
  virtual std::string description() const = 0;

  // The notification the user answered.
  virtual std::shared_ptr<UNNotification> notification() const = 0;
  virtual void setNotification(std::shared_ptr<UNNotification> notification) = 0;
  // The chosen action's identifier: UNNotificationDefaultActionIdentifier
  // for a click on the notification, UNNotificationDismissActionIdentifier
  // for its dismissal.
  virtual std::string actionIdentifier() const = 0;
  virtual void setActionIdentifier(std::string identifier) = 0;
};

}  // namespace kivi

// KivUNNotificationProtocol: a delivered user notification as code that
// handles it reads it: when it was delivered and the request it came from.
// The date and request can be set too, so that a test can build one.
//
// The library implements it only by its double, MockUNNotification
// (kivi::UNNotification answers the same reads).
//
//   void onDelivered(const kivi::KivUNNotificationProtocol& n) {
//     log(n.request().identifier, n.date());
//   }
//
// Thread contract: that of the implementation; the double is a plain value
// holder.
#pragma once

#include <string>

#include "kivi/desktop/user_notifications.h"
#include "kivi/export.h"

namespace kivi {

class KIVI_EXPORT KivUNNotificationProtocol {
 public:
  virtual ~KivUNNotificationProtocol() = default;

  // The base object interface.
  virtual std::string description() const = 0;

  // When the notification was delivered.
  virtual Date date() const = 0;
  virtual void setDate(Date date) = 0;
  // The request it was delivered for: its identifier, content and trigger.
  virtual UNNotificationRequest request() const = 0;
  virtual void setRequest(UNNotificationRequest request) = 0;
};

}  // namespace kivi

// MockUNNotification: a KivUNNotificationProtocol whose date and request are
// plain stored values (the epoch and an empty request at first), so that a
// test can build the notification its handler receives.
//
//   auto n = std::make_shared<kivi::MockUNNotification>();
//   n->setRequest({.identifier = "renewal"});
//   n->setDate(kivi::Date::now());
//   handler.onDelivered(*n);
//
// Thread contract: none; set the values before handing the double out.
#pragma once

#include <string>

#include "kivi/export.h"
#include "kivi/platform/kiv_un_notification_protocol.h"

namespace kivi {

class KIVI_EXPORT MockUNNotification : public Object, public KivUNNotificationProtocol {
 public:
  MockUNNotification() = default;

  std::string description() const override { return Object::description(); }

  Date date() const override { return date_; }
  void setDate(Date date) override { date_ = date; }
  UNNotificationRequest request() const override { return request_; }
  void setRequest(UNNotificationRequest request) override { request_ = std::move(request); }

 private:
  Date date_;
  UNNotificationRequest request_;
};

}  // namespace kivi

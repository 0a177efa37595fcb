// MockUNNotificationResponse: a KivUNNotificationResponseProtocol whose
// notification and action identifier are plain stored values (null and ""
// at first), so that a test can build the response its handler receives.
//
//   auto r = std::make_shared<kivi::MockUNNotificationResponse>();
//   r->setActionIdentifier(kivi::UNNotificationDefaultActionIdentifier);
//   handler.onResponse(*r);
//
// Thread contract: none; set the values before handing the double out.
#pragma once

#include <memory>
#include <string>

#include "kivi/export.h"
#include "kivi/platform/kiv_un_notification_response_protocol.h"

namespace kivi {

class KIVI_EXPORT MockUNNotificationResponse : public Object,
                                               public virtual KivUNNotificationResponseProtocol {
 public:
  MockUNNotificationResponse() = default;

  std::string description() const override { return Object::description(); }

  std::shared_ptr<UNNotification> notification() const override { return notification_; }
  void setNotification(std::shared_ptr<UNNotification> notification) override {
    notification_ = std::move(notification);
  }
  std::string actionIdentifier() const override { return actionIdentifier_; }
  void setActionIdentifier(std::string identifier) override {
    actionIdentifier_ = std::move(identifier);
  }

 private:
  std::shared_ptr<UNNotification> notification_;
  std::string actionIdentifier_;
};

}  // namespace kivi

// KivUNUserNotificationCenterProtocol: posting the application's user
// notifications and hearing the user's responses, behind an interface so that
// a host can hand it the real center
// (UNUserNotificationCenter::currentNotificationCenter()) or a scriptable
// double.
//
//   std::shared_ptr<kivi::KivUNUserNotificationCenterProtocol> center =
//       kivi::UNUserNotificationCenter::currentNotificationCenter();
//   center->requestAuthorization(kivi::UNAuthorizationOptionAlert,
//                                [=](bool granted, const kivi::ErrorPtr&) {
//                                  if (granted) center->add(request, nullptr);
//                                });
//
// Thread contract: that of the implementation; UNUserNotificationCenter may
// be called from any thread and calls completion handlers on a worker thread.
#pragma once

#include <functional>
#include <memory>
#include <set>

#include "kivi/base/error.h"
#include "kivi/desktop/user_notifications.h"
#include "kivi/export.h"

namespace kivi {

class KIVI_EXPORT KivUNUserNotificationCenterProtocol {
 public:
  virtual ~KivUNUserNotificationCenterProtocol() = default;

  // delegate (the real center holds it weakly); null when none.
  virtual std::shared_ptr<UNUserNotificationCenterDelegate> delegate() = 0;
  virtual void setDelegate(const std::shared_ptr<UNUserNotificationCenterDelegate>& delegate) = 0;
  // add:withCompletionHandler: — the completion (may be null) gets null on
  // success.
  virtual void add(const UNNotificationRequest& request,
                   std::function<void(const ErrorPtr& error)> completionHandler) = 0;
  // requestAuthorizationWithOptions:completionHandler:
  virtual void requestAuthorization(
      UNAuthorizationOptions options,
      std::function<void(bool granted, const ErrorPtr& error)> completionHandler) = 0;
  // getNotificationCategoriesWithCompletionHandler:
  virtual void getNotificationCategories(
      std::function<void(const std::set<UNNotificationCategory>& categories)>
          completionHandler) = 0;
  // setNotificationCategories:
  virtual void setNotificationCategories(const std::set<UNNotificationCategory>& categories) = 0;
};

}  // namespace kivi

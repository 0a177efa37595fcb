// MockKivUNUserNotificationCenter: a scriptable
// KivUNUserNotificationCenterProtocol.
//
// Every operation hands its arguments, completion included, to its callback
// (addBlock, requestAuthorizationBlock, getNotificationCategoriesBlock,
// setNotificationCategoriesBlock), which decides whether and how the
// completion runs. Without callbacks nothing is shown or stored and no
// completion is called. The delegate is a plain stored value (held
// strongly, unlike the real center's).
//
//   auto center = std::make_shared<kivi::MockKivUNUserNotificationCenter>();
//   center->requestAuthorizationBlock = [](kivi::UNAuthorizationOptions, auto done) {
//     done(false, nullptr);  // the user said no
//   };
//   reminders.setCenter(center);
//
// Thread contract: none; callbacks run synchronously on the calling thread.
// Set the callbacks before handing the double out.
#pragma once

#include <functional>
#include <memory>
#include <set>

#include "kivi/base/object.h"
#include "kivi/desktop/kiv_un_user_notification_center_protocol.h"
#include "kivi/export.h"

namespace kivi {

class KIVI_EXPORT MockKivUNUserNotificationCenter : public Object,
                                                    public KivUNUserNotificationCenterProtocol {
 public:
  MockKivUNUserNotificationCenter() = default;

  // Called by add(request, completionHandler); without it nothing is shown and the completion is
  // never called.
  std::function<void(const UNNotificationRequest&, std::function<void(const ErrorPtr&)>)> addBlock;
  // Called by requestAuthorization(options, completionHandler); without it the completion is never
  // called.
  std::function<void(UNAuthorizationOptions, std::function<void(bool, const ErrorPtr&)>)>
      requestAuthorizationBlock;
  // Called by getNotificationCategories(completionHandler); without it the completion is never
  // called.
  std::function<void(std::function<void(const std::set<UNNotificationCategory>&)>)>
      getNotificationCategoriesBlock;
  // Called by setNotificationCategories(categories); without it nothing is stored.
  std::function<void(const std::set<UNNotificationCategory>&)> setNotificationCategoriesBlock;

  std::shared_ptr<UNUserNotificationCenterDelegate> delegate() override { return delegate_; }
  void setDelegate(const std::shared_ptr<UNUserNotificationCenterDelegate>& delegate) override {
    delegate_ = delegate;
  }
  // Shows the notification `request` describes; here, hands both arguments to addBlock.
  void add(const UNNotificationRequest& request,
           std::function<void(const ErrorPtr&)> completionHandler) override {
    if (addBlock) addBlock(request, std::move(completionHandler));
  }
  // Asks the user's permission for `options`; here, hands both arguments to
  // requestAuthorizationBlock.
  void requestAuthorization(UNAuthorizationOptions options,
                            std::function<void(bool, const ErrorPtr&)> completionHandler) override {
    if (requestAuthorizationBlock) requestAuthorizationBlock(options, std::move(completionHandler));
  }
  // Hands the registered categories to `completionHandler`; here, hands the completion to
  // getNotificationCategoriesBlock.
  void getNotificationCategories(
      std::function<void(const std::set<UNNotificationCategory>&)> completionHandler) override {
    if (getNotificationCategoriesBlock)
      getNotificationCategoriesBlock(std::move(completionHandler));
  }
  void setNotificationCategories(const std::set<UNNotificationCategory>& categories) override {
    if (setNotificationCategoriesBlock) setNotificationCategoriesBlock(categories);
  }

 private:
  std::shared_ptr<UNUserNotificationCenterDelegate> delegate_;
};

}  // namespace kivi

// UNUserNotificationCenter: the application's user notifications, shown by
// the desktop's notification server (org.freedesktop.Notifications on the
// session bus), and the user's responses to them.
//
//   auto center = kivi::UNUserNotificationCenter::currentNotificationCenter();
//   center->setDelegate(myDelegate);                        // held weakly
//   center->setNotificationCategories({{"mail", {{"archive", "Archive", 0}}, {}, 0}});
//   kivi::UNNotificationContent content;
//   content.title = "New mail";
//   content.categoryIdentifier = "mail";
//   center->add({"mail-17", content, std::nullopt}, [](const kivi::ErrorPtr& error) {...});
//
// How a request becomes a notification (Notify):
//   app_name     the main bundle's CFBundleDisplayName, else its executable's
//                name; app_icon its entry's Icon, if any
//   replaces_id  the server's id of the notification an earlier request with
//                the same identifier showed, while it is still open; else 0
//   summary      the title; body the subtitle and the body, one per line
//   actions      "default" (clicking the notification), then the actions of
//                the category named by categoryIdentifier, if it is set
//   hints        "desktop-entry" (the main bundle's identifier, if any),
//                "sound-name" "message-new-instant" when `sound` is set,
//                else "suppress-sound"
//   expire_timeout -1 (the server's default)
// A request with a trigger is sent that many seconds after add(); add's
// completion then reports the sending. The connection to the server is made
// on first use and again when $DBUS_SESSION_BUS_ADDRESS names another bus or
// the connection was lost.
//
// Responses: ActionInvoked from the server becomes a UNNotificationResponse
// with the action's identifier ("default" reads as
// UNNotificationDefaultActionIdentifier); the server's NotificationReplied
// (an inline reply) a UNTextInputNotificationResponse with the action
// identifier "inline-reply"; NotificationClosed because the user dismissed
// it, for a category with UNNotificationCategoryOptionCustomDismissAction and
// only if no action was chosen, a response with
// UNNotificationDismissActionIdentifier. The delegate's
// didReceiveNotificationResponse is called on the center's own worker
// thread, one response at a time, in the order the server sent them. Only
// notifications this center showed on the current connection are answered.
// A delegate must not block waiting for one of the center's completion
// handlers: the center may be waiting for the delivery to return.
// willPresentNotification is never called: the desktop's notification server
// decides how a notification is shown, whether or not the application is in
// front.
//
// requestAuthorization grants (true, null) when the server answers
// GetCapabilities within the wait, and otherwise answers false with
// UNErrorDomain UNErrorCodeNotificationsNotAllowed; the options are not
// sent anywhere (the desktop has no per-application grant). add() fails with
// the same error when Notify gets no answer, and with
// UNErrorCodeNotificationInvalidNoDate for a trigger interval that is not
// positive. Categories are kept by the center, for this process only.
//
// Every wait for the server is bounded (kUNNotificationCenterTimeout).
//
// Thread contract: every member may be called from any thread. Completion
// handlers run on a worker thread after the call returned; those of add()
// in the order the requests were added.
#pragma once

#include <chrono>
#include <functional>
#include <memory>
#include <set>

#include "kivi/base/object.h"
#include "kivi/desktop/kiv_un_user_notification_center_protocol.h"
#include "kivi/export.h"

namespace kivi {

// The longest the center waits for the notification server to answer.
inline constexpr std::chrono::milliseconds kUNNotificationCenterTimeout{3000};

class KIVI_EXPORT UNUserNotificationCenter : public Object,
                                             public KivUNUserNotificationCenterProtocol {
 public:
  // The process's one center, made on first use and kept for the life of the process.
  static std::shared_ptr<UNUserNotificationCenter> currentNotificationCenter();

  ~UNUserNotificationCenter() override;

  std::shared_ptr<UNUserNotificationCenterDelegate> delegate() override;
  void setDelegate(const std::shared_ptr<UNUserNotificationCenterDelegate>& delegate) override;
  void add(const UNNotificationRequest& request,
           std::function<void(const ErrorPtr& error)> completionHandler) override;
  void requestAuthorization(
      UNAuthorizationOptions options,
      std::function<void(bool granted, const ErrorPtr& error)> completionHandler) override;
  void getNotificationCategories(
      std::function<void(const std::set<UNNotificationCategory>& categories)> completionHandler)
      override;
  void setNotificationCategories(const std::set<UNNotificationCategory>& categories) override;

  std::string className() const override { return "UNUserNotificationCenter"; }

 private:
  struct Impl;
  UNUserNotificationCenter();
  std::unique_ptr<Impl> impl_;
};

}  // namespace kivi

// The values of user notifications: what a notification says (content), the
// request that schedules it, the actions and categories that give it buttons,
// the delivered notification and the user's response to it, the delegate
// that receives responses, and the error domain of the notification center.
//
//   kivi::UNNotificationContent content;
//   content.title = "Download finished";
//   content.body = "report.pdf is in Downloads.";
//   content.categoryIdentifier = "download";
//   kivi::UNNotificationRequest request{"download-42", content, std::nullopt};
//
//   kivi::UNNotificationCategory category{
//       "download", {{"show", "Show in Folder", 0}}, {}, kivi::UNNotificationCategoryOptionNone};
//   center->setNotificationCategories({category});
//   center->add(request, nullptr);
//
// Thread contract: the structs are value types; UNNotification and the
// responses are immutable once made and may be shared between threads.
#pragma once

#include <compare>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "kivi/base/error.h"
#include "kivi/base/object.h"
#include "kivi/base/value.h"
#include "kivi/export.h"

namespace kivi {

class UNUserNotificationCenter;

// The domain of the notification center's errors; the codes are UNErrorCode's.
inline constexpr const char* UNErrorDomain = "UNErrorDomain";

// Codes in UNErrorDomain. The center gives UNErrorCodeNotificationsNotAllowed (no server, or
// no answer in time) and UNErrorCodeNotificationInvalidNoDate (a trigger interval that is not
// positive); the others are for code that reports those failures itself.
enum UNErrorCode : std::int64_t {
  UNErrorCodeNotificationsNotAllowed = 1,
  UNErrorCodeAttachmentInvalidURL = 100,
  UNErrorCodeAttachmentUnrecognizedType = 101,
  UNErrorCodeAttachmentInvalidFileSize = 102,
  UNErrorCodeAttachmentNotInDataStore = 103,
  UNErrorCodeAttachmentMoveIntoDataStoreFailed = 104,
  UNErrorCodeAttachmentCorrupt = 105,
  UNErrorCodeNotificationInvalidNoDate = 1400,
  UNErrorCodeNotificationInvalidNoContent = 1401,
  UNErrorCodeContentProvidingObjectNotAllowed = 1500,
  UNErrorCodeContentProvidingInvalid = 1501,
  UNErrorCodeBadgeInputInvalid = 1600,
};

// Authorization options (requestAuthorization), the platform's bits.
using UNAuthorizationOptions = std::uint64_t;
inline constexpr UNAuthorizationOptions UNAuthorizationOptionNone = 0;
inline constexpr UNAuthorizationOptions UNAuthorizationOptionBadge = 1 << 0;
inline constexpr UNAuthorizationOptions UNAuthorizationOptionSound = 1 << 1;
inline constexpr UNAuthorizationOptions UNAuthorizationOptionAlert = 1 << 2;
inline constexpr UNAuthorizationOptions UNAuthorizationOptionCarPlay = 1 << 3;
inline constexpr UNAuthorizationOptions UNAuthorizationOptionCriticalAlert = 1 << 4;
inline constexpr UNAuthorizationOptions UNAuthorizationOptionProvidesAppNotificationSettings = 1
                                                                                               << 5;
inline constexpr UNAuthorizationOptions UNAuthorizationOptionProvisional = 1 << 6;
inline constexpr UNAuthorizationOptions UNAuthorizationOptionTimeSensitive = 1 << 8;

// How a notification is presented while the application is in front
// (willPresentNotification's answer), the platform's bits.
using UNNotificationPresentationOptions = std::uint64_t;
inline constexpr UNNotificationPresentationOptions UNNotificationPresentationOptionNone = 0;
inline constexpr UNNotificationPresentationOptions UNNotificationPresentationOptionBadge = 1 << 0;
inline constexpr UNNotificationPresentationOptions UNNotificationPresentationOptionSound = 1 << 1;
inline constexpr UNNotificationPresentationOptions UNNotificationPresentationOptionAlert = 1 << 2;
inline constexpr UNNotificationPresentationOptions UNNotificationPresentationOptionList = 1 << 3;
inline constexpr UNNotificationPresentationOptions UNNotificationPresentationOptionBanner = 1 << 4;

// Options of an action, the platform's bits; they are not sent to the notification server.
using UNNotificationActionOptions = std::uint64_t;
inline constexpr UNNotificationActionOptions UNNotificationActionOptionNone = 0;
inline constexpr UNNotificationActionOptions UNNotificationActionOptionAuthenticationRequired =
    1 << 0;
inline constexpr UNNotificationActionOptions UNNotificationActionOptionDestructive = 1 << 1;
inline constexpr UNNotificationActionOptions UNNotificationActionOptionForeground = 1 << 2;

// Options of a category, the platform's bits.
using UNNotificationCategoryOptions = std::uint64_t;
inline constexpr UNNotificationCategoryOptions UNNotificationCategoryOptionNone = 0;
// The delegate hears of the user dismissing a notification of this category
// (a response with UNNotificationDismissActionIdentifier).
inline constexpr UNNotificationCategoryOptions UNNotificationCategoryOptionCustomDismissAction =
    1 << 0;
// Kept without effect: the desktop has no car display, and hidden previews are the server's.
inline constexpr UNNotificationCategoryOptions UNNotificationCategoryOptionAllowInCarPlay = 1 << 1;
inline constexpr UNNotificationCategoryOptions UNNotificationCategoryOptionHiddenPreviewsShowTitle =
    1 << 2;
inline constexpr UNNotificationCategoryOptions
    UNNotificationCategoryOptionHiddenPreviewsShowSubtitle = 1 << 3;

// The action identifiers of a response to the notification itself (the user
// clicked it) and to its dismissal.
inline constexpr const char* UNNotificationDefaultActionIdentifier =
    "com.apple.UNNotificationDefaultActionIdentifier";
inline constexpr const char* UNNotificationDismissActionIdentifier =
    "com.apple.UNNotificationDismissActionIdentifier";

// What a notification says.
struct KIVI_EXPORT UNNotificationContent {
  std::string title;     // the summary line
  std::string subtitle;  // the body's first line
  std::string body;      // the text, below the subtitle
  Dictionary userInfo;   // the application's own values; not shown
  // Names the UNNotificationCategory whose actions the notification offers.
  std::string categoryIdentifier;
  // Groups related notifications; not sent to the notification server.
  std::string threadIdentifier;
  // Whether the notification plays the default sound.
  bool sound = false;

  friend bool operator==(const UNNotificationContent&, const UNNotificationContent&) = default;
};

// Delivers a notification `timeInterval` seconds after it was added; the
// interval must be positive.
struct KIVI_EXPORT UNTimeIntervalNotificationTrigger {
  double timeInterval = 0;  // seconds after add()

  friend bool operator==(const UNTimeIntervalNotificationTrigger&,
                         const UNTimeIntervalNotificationTrigger&) = default;
};

// A notification for add() to show, at once or after its trigger.
struct KIVI_EXPORT UNNotificationRequest {
  // A later request with the same identifier replaces the notification.
  std::string identifier;
  // What the notification says.
  UNNotificationContent content;
  // Absent: deliver now.
  std::optional<UNTimeIntervalNotificationTrigger> trigger;

  friend bool operator==(const UNNotificationRequest&, const UNNotificationRequest&) = default;
};

// A button that the notifications of a category offer.
struct KIVI_EXPORT UNNotificationAction {
  std::string identifier;  // the response's actionIdentifier when the user chooses it
  std::string title;       // the button's label
  // UNNotificationActionOption… bits; not sent to the notification server.
  UNNotificationActionOptions options = UNNotificationActionOptionNone;

  friend auto operator<=>(const UNNotificationAction&, const UNNotificationAction&) = default;
};

// A kind of notification, named by UNNotificationContent::categoryIdentifier: the actions
// its notifications offer and its options.
struct KIVI_EXPORT UNNotificationCategory {
  std::string identifier;                      // what categoryIdentifier names
  std::vector<UNNotificationAction> actions;   // buttons, in this order
  std::vector<std::string> intentIdentifiers;  // kept without effect
  // UNNotificationCategoryOption… bits.
  UNNotificationCategoryOptions options = UNNotificationCategoryOptionNone;

  // Ordered by every field in turn, so that a std::set holds distinct
  // categories.
  friend auto operator<=>(const UNNotificationCategory&, const UNNotificationCategory&) = default;
};

// A delivered notification: when it was delivered, and its request.
class KIVI_EXPORT UNNotification : public Object {
 public:
  // Made by the center when the server shows a request.
  UNNotification(Date date, UNNotificationRequest request)
      : date_(date), request_(std::move(request)) {}

  // When the notification was delivered.
  Date date() const { return date_; }
  // The request it shows.
  const UNNotificationRequest& request() const { return request_; }

  std::string className() const override { return "UNNotification"; }

 private:
  const Date date_;
  const UNNotificationRequest request_;
};

// The user's answer to a notification: the action they chose
// (UNNotificationDefaultActionIdentifier for the notification itself).
class KIVI_EXPORT UNNotificationResponse : public Object {
 public:
  // Made by the center from the server's signal.
  UNNotificationResponse(std::shared_ptr<UNNotification> notification, std::string actionIdentifier)
      : notification_(std::move(notification)), actionIdentifier_(std::move(actionIdentifier)) {}

  // The notification answered.
  const std::shared_ptr<UNNotification>& notification() const { return notification_; }
  // The chosen action's identifier, UNNotificationDefaultActionIdentifier or
  // UNNotificationDismissActionIdentifier.
  const std::string& actionIdentifier() const { return actionIdentifier_; }

  std::string className() const override { return "UNNotificationResponse"; }

 private:
  const std::shared_ptr<UNNotification> notification_;
  const std::string actionIdentifier_;
};

// A response that carries text the user typed.
class KIVI_EXPORT UNTextInputNotificationResponse : public UNNotificationResponse {
 public:
  // Made by the center from the server's inline reply.
  UNTextInputNotificationResponse(std::shared_ptr<UNNotification> notification,
                                  std::string actionIdentifier, std::string userText)
      : UNNotificationResponse(std::move(notification), std::move(actionIdentifier)),
        userText_(std::move(userText)) {}

  // What the user typed.
  const std::string& userText() const { return userText_; }

  std::string className() const override { return "UNTextInputNotificationResponse"; }

 private:
  const std::string userText_;
};

// Receives what happens to the application's notifications. Both operations
// do nothing by default but call their completion handler.
class KIVI_EXPORT UNUserNotificationCenterDelegate {
 public:
  virtual ~UNUserNotificationCenterDelegate() = default;

  // userNotificationCenter:willPresentNotification:withCompletionHandler:
  virtual void willPresentNotification(
      const std::shared_ptr<UNUserNotificationCenter>& center,
      const std::shared_ptr<UNNotification>& notification,
      std::function<void(UNNotificationPresentationOptions)> completionHandler) {
    (void)center;
    (void)notification;
    if (completionHandler) completionHandler(UNNotificationPresentationOptionNone);
  }

  // userNotificationCenter:didReceiveNotificationResponse:withCompletionHandler:
  virtual void didReceiveNotificationResponse(
      const std::shared_ptr<UNUserNotificationCenter>& center,
      const std::shared_ptr<UNNotificationResponse>& response,
      std::function<void()> completionHandler) {
    (void)center;
    (void)response;
    if (completionHandler) completionHandler();
  }
};

}  // namespace kivi

// UNUserNotificationCenter against dbusmock's notification server on a
// private session bus, with the server's signals sent by gdbus.
#include "kivi/desktop/un_user_notification_center.h"

#include <gtest/gtest.h>

#include <cmath>
#include <future>
#include <mutex>
#include <thread>

#include "desktop_fixture.h"
#include "kivi/desktop/ns_bundle.h"

namespace kivi {
namespace {

constexpr const char* kServer = "org.freedesktop.Notifications";

class Responses : public UNUserNotificationCenterDelegate {
 public:
  void didReceiveNotificationResponse(const std::shared_ptr<UNUserNotificationCenter>& center,
                                      const std::shared_ptr<UNNotificationResponse>& response,
                                      std::function<void()> completionHandler) override {
    {
      std::lock_guard lock(mutex_);
      EXPECT_EQ(center, UNUserNotificationCenter::currentNotificationCenter());
      EXPECT_NE(std::this_thread::get_id(), caller_);
      std::string line =
          response->notification()->request().identifier + " " + response->actionIdentifier();
      if (auto* text = dynamic_cast<UNTextInputNotificationResponse*>(response.get())) {
        line += " \"" + text->userText() + "\"";
      }
      lines_.push_back(line);
    }
    completionHandler();
    arrived_.notify();
  }

  // The first `count` responses, one line each ("<request id> <action>").
  std::vector<std::string> first(int count) {
    EXPECT_TRUE(arrived_.wait(count));
    std::lock_guard lock(mutex_);
    return lines_;
  }

 private:
  const std::thread::id caller_ = std::this_thread::get_id();
  std::mutex mutex_;
  std::vector<std::string> lines_;
  testing::Signal arrived_;
};

UNNotificationRequest request(const std::string& identifier, const std::string& category = "",
                              const std::string& title = "Title") {
  UNNotificationRequest request;
  request.identifier = identifier;
  request.content.title = title;
  request.content.categoryIdentifier = category;
  return request;
}

class UNUserNotificationCenterTest : public testing::DesktopTest {
 protected:
  void TearDown() override {
    center_->setDelegate(nullptr);
    center_->setNotificationCategories({});
    testing::DesktopTest::TearDown();
  }

  // add() and the error its completion got.
  ErrorPtr add(const UNNotificationRequest& request) {
    auto done = std::make_shared<std::promise<ErrorPtr>>();
    center_->add(request, [done](const ErrorPtr& error) { done->set_value(error); });
    auto future = done->get_future();
    if (future.wait_for(testing::kTimeout) != std::future_status::ready) {
      ADD_FAILURE() << "add() did not complete";
      return nullptr;
    }
    return future.get();
  }

  std::pair<bool, ErrorPtr> authorize() {
    auto done = std::make_shared<std::promise<std::pair<bool, ErrorPtr>>>();
    center_->requestAuthorization(UNAuthorizationOptionAlert | UNAuthorizationOptionSound,
                                  [done](bool granted, const ErrorPtr& error) {
                                    done->set_value({granted, error});
                                  });
    auto future = done->get_future();
    if (future.wait_for(testing::kTimeout) != std::future_status::ready) {
      ADD_FAILURE() << "requestAuthorization() did not complete";
      return {};
    }
    return future.get();
  }

  // The server sends `signal` with `arguments` (GVariant text).
  void emit(const std::string& signal, const std::vector<std::string>& arguments) {
    // --session (the bus from the environment) says Hello first, so that the
    // signal carries a sender as a server's would.
    std::vector<std::string> command = {"/usr/bin/gdbus",
                                        "emit",
                                        "--session",
                                        "--object-path",
                                        "/org/freedesktop/Notifications",
                                        "--signal",
                                        std::string(kServer) + "." + signal};
    command.insert(command.end(), arguments.begin(), arguments.end());
    ASSERT_EQ(testing::runChild(command, {"DBUS_SESSION_BUS_ADDRESS=" + bus_.address()}).exitCode,
              0);
  }

  std::shared_ptr<UNUserNotificationCenter> center_ =
      UNUserNotificationCenter::currentNotificationCenter();
};

void expectNotAllowed(const ErrorPtr& error, const std::string& description) {
  ASSERT_NE(error, nullptr);
  EXPECT_EQ(error->domain(), UNErrorDomain);
  EXPECT_EQ(error->code(), UNErrorCodeNotificationsNotAllowed);
  EXPECT_EQ(error->localizedDescription(), description);
}

TEST_F(UNUserNotificationCenterTest, PostsWithTheCategorysActionsAndReplacesByIdentifier) {
  ASSERT_NO_FATAL_FAILURE(startService("notification_daemon", kServer));
  center_->setNotificationCategories(
      {{"mail", {{"archive", "Archive", 0}, {"reply", "Reply", 0}}, {}, 0},
       {"other", {{"x", "X", 0}}, {}, 0}});
  UNNotificationRequest first = request("a", "mail", "New mail");
  first.content.subtitle = "From Ana";
  first.content.body = "Lunch?";
  EXPECT_EQ(add(first), nullptr);
  const std::string app = NSBundle::mainBundle()->executablePath().substr(
      NSBundle::mainBundle()->executablePath().rfind('/') + 1);
  EXPECT_TRUE(logShows(kServer, "Notify \"" + app +
                                    "\" 0 \"\" \"New mail\" \"From Ana\nLunch?\" "
                                    "[\"default\", \"\", \"archive\", \"Archive\", \"reply\", "
                                    "\"Reply\"] {\"suppress-sound\": True} -1"));
  UNNotificationRequest again = request("a", "unknown-category", "Two mails");
  again.content.sound = true;
  EXPECT_EQ(add(again), nullptr);
  EXPECT_TRUE(logShows(kServer, "Notify \"" + app +
                                    "\" 1 \"\" \"Two mails\" \"\" [\"default\", "
                                    "\"\"] {\"sound-name\": \"message-new-instant\"} -1"));
  EXPECT_EQ(add(request("b")), nullptr);
  EXPECT_TRUE(logShows(kServer, "Notify \"" + app + "\" 0 \"\" \"Title\""));
  // A null completion: sent all the same.
  center_->add(request("c", "", "Unheard"), nullptr);
  EXPECT_TRUE(logShows(kServer, "\"Unheard\""));
}

TEST_F(UNUserNotificationCenterTest, AuthorizationNeedsAServerThatAnswers) {
  auto [refused, why] = authorize();
  EXPECT_FALSE(refused);
  expectNotAllowed(why, "No notification server is running.");
  expectNotAllowed(add(request("a")), "No notification server is running.");

  ASSERT_NO_FATAL_FAILURE(startService("notification_daemon", kServer));
  auto [granted, error] = authorize();
  EXPECT_TRUE(granted);
  EXPECT_EQ(error, nullptr);

  setVariable("DBUS_SESSION_BUS_ADDRESS", "unix:path=" + dir_ + "/no-bus");
  auto [noBus, reason] = authorize();
  EXPECT_FALSE(noBus);
  expectNotAllowed(reason, "The session bus cannot be reached.");
}

TEST_F(UNUserNotificationCenterTest, AServerThatNeverAnswersFailsWithinTheWait) {
  ASSERT_NO_FATAL_FAILURE(startService("silent_notification_server.py", kServer));
  const auto start = std::chrono::steady_clock::now();
  auto [granted, error] = authorize();
  EXPECT_FALSE(granted);
  expectNotAllowed(error, "The notification server did not answer in time.");
  expectNotAllowed(add(request("a")), "The notification server did not answer in time.");
  EXPECT_LT(std::chrono::steady_clock::now() - start,
            2 * kUNNotificationCenterTimeout + std::chrono::seconds(2));
}

TEST_F(UNUserNotificationCenterTest, ResponsesReachTheDelegateInOrder) {
  ASSERT_NO_FATAL_FAILURE(startService("notification_daemon", kServer));
  auto delegate = std::make_shared<Responses>();
  center_->setDelegate(delegate);
  EXPECT_EQ(center_->delegate(), delegate);
  center_->setNotificationCategories({{"dismissable",
                                       {{"archive", "Archive", 0}},
                                       {},
                                       UNNotificationCategoryOptionCustomDismissAction},
                                      {"plain", {}, {}, 0}});
  ASSERT_EQ(add(request("one", "dismissable")), nullptr);  // id 1
  ASSERT_EQ(add(request("two", "dismissable")), nullptr);  // id 2
  ASSERT_EQ(add(request("three", "plain")), nullptr);      // id 3
  ASSERT_EQ(add(request("four")), nullptr);                // id 4

  emit("ActionInvoked", {"uint32 1", "'default'"});
  emit("ActionInvoked", {"uint32 1", "'archive'"});
  emit("NotificationClosed", {"uint32 1", "uint32 2"});  // answered already: no dismissal
  emit("NotificationClosed", {"uint32 2", "uint32 2"});
  emit("NotificationClosed", {"uint32 3", "uint32 2"});     // its category wants no dismissals
  emit("NotificationClosed", {"uint32 4", "uint32 1"});     // expired
  emit("ActionInvoked", {"uint32 99", "'default'"});        // not ours
  emit("ActionInvoked", {"1", "'default'"});                // not the server's signature
  emit("NotificationReplied", {"uint32 1", "'too late'"});  // closed already
  ASSERT_EQ(add(request("five")), nullptr);                 // id 5
  emit("NotificationReplied", {"uint32 5", "'on my way'"});
  EXPECT_EQ(delegate->first(4),
            (std::vector<std::string>{"one " + std::string(UNNotificationDefaultActionIdentifier),
                                      "one archive",
                                      "two " + std::string(UNNotificationDismissActionIdentifier),
                                      "five inline-reply \"on my way\""}));

  // A closed notification is no longer replaced: its identifier starts afresh.
  ASSERT_EQ(add(request("two", "", "Again")), nullptr);
  EXPECT_TRUE(logShows(kServer, "0 \"\" \"Again\""));
}

TEST_F(UNUserNotificationCenterTest, TheDelegateIsHeldWeakly) {
  auto delegate = std::make_shared<Responses>();
  center_->setDelegate(delegate);
  std::weak_ptr<Responses> watch = delegate;
  delegate.reset();
  EXPECT_TRUE(watch.expired());
  EXPECT_EQ(center_->delegate(), nullptr);
}

TEST_F(UNUserNotificationCenterTest, TriggeredRequestsAreSentLater) {
  ASSERT_NO_FATAL_FAILURE(startService("notification_daemon", kServer));
  UNNotificationRequest never = request("never");
  for (double interval : {0.0, -1.0, std::nan("")}) {
    never.trigger = UNTimeIntervalNotificationTrigger{interval};
    const ErrorPtr error = add(never);
    ASSERT_NE(error, nullptr);
    EXPECT_EQ(error->domain(), UNErrorDomain);
    EXPECT_EQ(error->code(), UNErrorCodeNotificationInvalidNoDate);
  }
  UNNotificationRequest later = request("later", "", "Later");
  later.trigger = UNTimeIntervalNotificationTrigger{0.3};
  const auto start = std::chrono::steady_clock::now();
  EXPECT_EQ(add(later), nullptr);
  EXPECT_GE(std::chrono::steady_clock::now() - start, std::chrono::milliseconds(250));
  EXPECT_TRUE(logShows(kServer, "\"Later\""));
  EXPECT_EQ(log(kServer).find("never"), std::string::npos);
}

TEST_F(UNUserNotificationCenterTest, CategoriesAreKeptByTheCenter) {
  const std::set<UNNotificationCategory> categories = {
      {"b", {{"x", "X", UNNotificationActionOptionDestructive}}, {"intent"}, 0},
      {"a", {}, {}, UNNotificationCategoryOptionCustomDismissAction},
      {"a", {}, {}, UNNotificationCategoryOptionCustomDismissAction}};
  EXPECT_EQ(categories.size(), 2u);
  center_->setNotificationCategories(categories);
  auto done = std::make_shared<std::promise<std::set<UNNotificationCategory>>>();
  center_->getNotificationCategories(
      [done](const std::set<UNNotificationCategory>& got) { done->set_value(got); });
  auto future = done->get_future();
  ASSERT_EQ(future.wait_for(testing::kTimeout), std::future_status::ready);
  EXPECT_EQ(future.get(), categories);
  center_->getNotificationCategories(nullptr);
}

}  // namespace
}  // namespace kivi

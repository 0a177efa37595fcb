// The doubles' behaviour beyond the one rule: class-level callbacks, the
// doubles that extend another, the stateful cookie doubles, the process
// double's answers and the defaults that make real objects.
#include <gtest/gtest.h>

#include <cstdlib>
#include <memory>
#include <string>
#include <vector>

#include "kivi/doubles/mock_kiv_ns_distributed_notification_center.h"
#include "kivi/doubles/mock_kiv_ns_file_manager.h"
#include "kivi/doubles/mock_kiv_ns_http_cookie_storage.h"
#include "kivi/doubles/mock_kiv_ns_open_panel.h"
#include "kivi/doubles/mock_kiv_ns_pipe_factory.h"
#include "kivi/doubles/mock_kiv_ns_running_application.h"
#include "kivi/doubles/mock_kiv_ns_url.h"
#include "kivi/doubles/mock_kiv_process_factory.h"
#include "kivi/doubles/mock_kiv_wk_http_cookie_store.h"
#include "kivi/doubles/mock_ns_event.h"
#include "kivi/doubles/mock_un_text_input_notification_response.h"
#include "kivi/net/url.h"

namespace kivi {
namespace {

HTTPCookiePtr cookie(const std::string& name, const std::string& value = "v") {
  HTTPCookie::Properties p;
  p.name = name;
  p.value = value;
  p.domain = "example.com";
  return HTTPCookie::cookieWithProperties(p);
}

// A class-level callback answers for every object, made before or after it
// was set, until it is reset.
TEST(DoubleClassLevelCallbacks, AreSharedByEveryObject) {
  std::shared_ptr<KivNSEventProtocol> early = std::make_shared<MockNSEvent>();
  auto monitor = std::make_shared<NSObject>();
  std::vector<NSEventMask> masks;
  MockNSEvent::addLocalMonitorBlock = [&](NSEventMask mask, NSEventMonitorHandler) -> ObjectPtr {
    masks.push_back(mask);
    return monitor;
  };
  std::shared_ptr<KivNSEventProtocol> late = std::make_shared<MockNSEvent>();
  EXPECT_EQ(early->addLocalMonitorForEvents(NSEventMaskKeyDown, nullptr), monitor);
  EXPECT_EQ(late->addLocalMonitorForEvents(NSEventMaskKeyUp, nullptr), monitor);
  EXPECT_EQ(masks, (std::vector<NSEventMask>{NSEventMaskKeyDown, NSEventMaskKeyUp}));
  MockNSEvent::addLocalMonitorBlock = nullptr;
  EXPECT_EQ(late->addLocalMonitorForEvents(NSEventMaskKeyUp, nullptr), nullptr);

  // The URL double's bookmark callback answers the instance operation too.
  MockKivNSURL::bookmarkDataBlock = [](std::uint64_t, const auto&, const URLPtr&, ErrorPtr*) {
    return std::optional<Data>(Data{1, 2, 3});
  };
  MockKivNSURL first, second;
  EXPECT_EQ(first.bookmarkDataWithOptions(0, std::nullopt, nullptr, nullptr), (Data{1, 2, 3}));
  EXPECT_EQ(second.bookmarkDataWithOptions(0, std::nullopt, nullptr, nullptr), (Data{1, 2, 3}));
  MockKivNSURL::bookmarkDataBlock = nullptr;
}

// A callback decides about out-parameters and completions: what it writes
// reaches the caller, and a completion runs when it runs it.
TEST(DoubleCallbacks, OwnOutParametersAndCompletions) {
  MockKivNSFileManager files;
  files.removeItemAtPathBlock = [](const std::string& path, ErrorPtr* error) {
    if (error) *error = Error::create(POSIXErrorDomain, 13, {{FilePathErrorKey, Value(path)}});
    return false;
  };
  files.fileExistsAtPathIsDirectoryBlock = [](const std::string&, bool* isDirectory) {
    *isDirectory = true;
    return true;
  };
  KivNSFileManagerProtocol& fm = files;
  ErrorPtr error;
  EXPECT_FALSE(fm.removeItemAtPath("/locked", &error));
  ASSERT_TRUE(error);
  EXPECT_EQ(error->code(), 13);
  EXPECT_FALSE(fm.removeItemAtPath("/locked", nullptr));  // a null out-parameter is fine
  bool isDirectory = false;
  EXPECT_TRUE(fm.fileExistsAtPath("/d", &isDirectory));
  EXPECT_TRUE(isDirectory);

  MockKivNSSavePanel panel;
  std::function<void(NSModalResponse)> pending;
  panel.beginBlock = [&](NSModalCompletionHandler done) { pending = std::move(done); };
  std::vector<NSModalResponse> responses;
  panel.begin([&](NSModalResponse r) { responses.push_back(r); });
  EXPECT_TRUE(responses.empty()) << "the completion runs when the callback runs it";
  pending(NSModalResponseOK);
  EXPECT_EQ(responses, (std::vector<NSModalResponse>{NSModalResponseOK}));
}

// The distributed center's own callbacks answer both forms of the two
// operations it shares with the in-process center; the inherited ones stay
// silent for them but still answer the rest.
TEST(DerivedDoubles, DistributedCenterReplacesTheSharedOperations) {
  MockKivNSDistributedNotificationCenter center;
  int inherited = 0;
  center.addObserverBlock = [&](auto&&...) { ++inherited; };
  center.removeObserverNameObjectBlock = [&](auto&&...) { ++inherited; };
  std::vector<std::string> objects;
  center.addDistributedNotificationObserverBlock =
      [&](const ObjectPtr&, const Selector&, const std::string&, const std::string& object) {
        objects.push_back(object);
      };
  center.removeDistributedNotificationObserverBlock = [&](const ObjectPtr&, const std::string&,
                                                          const std::string& object) {
    objects.push_back(object);
  };
  int posted = 0;
  center.postNotificationBlock = [&](const NSNotificationPtr&) { ++posted; };

  KivNSNotificationCenterProtocol& local = center;
  KivNSDistributedNotificationCenterProtocol& distributed = center;
  auto observer = std::make_shared<NSObject>();
  local.addObserver(observer, Selector{"s", {}}, "n", nullptr);
  local.removeObserver(observer, "n", observer);
  distributed.addObserver(observer, Selector{"s", {}}, "n", "agent");
  distributed.removeObserver(observer, "n", "agent");
  local.postNotification(std::make_shared<NSNotification>("n", nullptr));

  EXPECT_EQ(inherited, 0);
  EXPECT_EQ(objects, (std::vector<std::string>{"", observer->description(), "agent", "agent"}));
  EXPECT_EQ(posted, 1);
}

// The open panel is a save panel double too, through either interface; the
// text-input response keeps the response's values.
TEST(DerivedDoubles, ExtendTheirBaseDouble) {
  auto panel = std::make_shared<MockKivNSOpenPanel>();
  int begun = 0;
  panel->beginBlock = [&](NSModalCompletionHandler) { ++begun; };
  panel->mockUrl = URL::URLWithString("file:///tmp/a");
  KivNSOpenPanelProtocol& open = *panel;
  KivNSSavePanelProtocol& save = *panel;
  open.begin(nullptr);
  save.begin(nullptr);
  EXPECT_EQ(begun, 2);
  open.setTitle("Import");
  EXPECT_EQ(save.title(), "Import");
  EXPECT_EQ(open.url(), panel->mockUrl);

  MockUNTextInputNotificationResponse response;
  KivUNNotificationResponseProtocol& plain = response;
  plain.setActionIdentifier("reply");
  response.setUserText("on my way");
  const KivUNTextInputNotificationResponseProtocol& text = response;
  EXPECT_EQ(text.actionIdentifier(), "reply");
  EXPECT_EQ(text.userText(), "on my way");
}

TEST(CookieDoubles, StorageKeepsAListOfWhatWasSet) {
  MockKivNSHTTPCookieStorage storage;
  KivNSHTTPCookieStorageProtocol& jar = storage;
  auto a = cookie("a");
  auto b = cookie("b");
  jar.setCookie(a);
  jar.setCookie(b);
  jar.setCookie(cookie("a"));  // equal to `a`, kept anyway
  ASSERT_EQ(jar.cookies().size(), 3u);
  EXPECT_EQ(jar.cookies()[1], b) << "insertion order";

  auto copy = jar.cookies();
  copy.clear();
  EXPECT_EQ(jar.cookies().size(), 3u) << "cookies() answers a copy";

  jar.deleteCookie(cookie("a"));  // by equality, every one
  EXPECT_EQ(jar.cookies(), (std::vector<HTTPCookiePtr>{b}));
  jar.deleteCookie(cookie("a", "other value"));
  jar.deleteCookie(nullptr);
  EXPECT_EQ(jar.cookies().size(), 1u);

  jar.setCookies({a}, URL::URLWithString("https://example.com"), nullptr);
  jar.removeCookiesSinceDate(Date{0});
  EXPECT_TRUE(jar.cookiesForURL(URL::URLWithString("https://example.com")).empty());
  EXPECT_EQ(jar.cookies().size(), 1u) << "these operations never touch the list";

  storage.internalCookies = {a, a};
  EXPECT_EQ(jar.cookies().size(), 2u);
}

TEST(CookieDoubles, WebStoreAnswersAvailableCookiesAtOnce) {
  MockKivWKHTTPCookieStore store;
  KivWKHTTPCookieStoreProtocol& web = store;
  std::vector<std::vector<HTTPCookiePtr>> answers;
  auto collect = [&](const std::vector<HTTPCookiePtr>& c) { answers.push_back(c); };
  web.getAllCookies(collect);
  store.availableCookies = std::vector<HTTPCookiePtr>{cookie("a")};
  web.getAllCookies(collect);
  web.getAllCookies(nullptr);
  ASSERT_EQ(answers.size(), 2u);
  EXPECT_TRUE(answers[0].empty());
  ASSERT_EQ(answers[1].size(), 1u);
  EXPECT_EQ(answers[1][0]->name(), "a");
}

TEST(ProcessDoubles, AnswerTheirTerminationValuesAndMakeFreshObjects) {
  MockKivNSProcess process;
  KivNSProcessProtocol& p = process;
  EXPECT_EQ(p.terminationStatus(), 1);
  EXPECT_EQ(p.terminationReason(), NSTaskTerminationReasonExit);
  process.mockRunning = true;
  EXPECT_FALSE(p.isRunning()) << "mockRunning is only stored";
  EXPECT_TRUE(process.mockRunning);
  process.mockTerminationStatus = 0;
  process.mockTerminationReason = NSTaskTerminationReasonUncaughtSignal;
  EXPECT_EQ(p.terminationStatus(), 0);
  EXPECT_EQ(p.terminationReason(), NSTaskTerminationReasonUncaughtSignal);

  MockKivProcessFactory processes;
  auto one = processes.createProcess();
  auto two = processes.createProcess();
  EXPECT_TRUE(std::dynamic_pointer_cast<MockKivNSProcess>(one));
  EXPECT_NE(one, two);

  MockKivNSPipeFactory pipes;
  auto pipe1 = pipes.createPipe();
  auto pipe2 = pipes.createPipe();
  ASSERT_TRUE(pipe1 && pipe2);
  EXPECT_NE(pipe1, pipe2);
  ASSERT_TRUE(pipe1->fileHandleForReading() && pipe1->fileHandleForWriting());
}

TEST(FileManagerDouble, TemporaryDirectoryIsTheRealOneUntilSet) {
  MockKivNSFileManager files;
  const char* env = std::getenv("TMPDIR");
  std::string expected = env && *env ? env : "/tmp";
  if (expected.back() != '/') expected += '/';
  auto real = files.temporaryDirectory();
  ASSERT_TRUE(real);
  EXPECT_EQ(real->absoluteString(), URL::fileURLWithPath(expected)->absoluteString());
  EXPECT_EQ(real->absoluteString().back(), '/');
  files.temporaryDirectoryURL = URL::fileURLWithPath("/scratch/");
  EXPECT_EQ(files.temporaryDirectory(), files.temporaryDirectoryURL);
}

}  // namespace
}  // namespace kivi

// NSWorkspace against a scripted portal, file manager and xdg-open, and
// desktop entries in temporary XDG directories.
#include "kivi/desktop/ns_workspace.h"

#include <gtest/gtest.h>
#include <unistd.h>

#include <future>
#include <thread>

#include "desktop_fixture.h"
#include "kivi/net/kiv_ns_url_protocol.h"
#include "kivi/process/ns_running_application.h"
#include "kivi/text/json_serialization.h"

namespace kivi {
namespace {

constexpr const char* kPortal = "org.freedesktop.portal.Desktop";
constexpr const char* kFileManager = "org.freedesktop.FileManager1";

struct Completion {
  std::shared_ptr<NSRunningApplication> application;
  ErrorPtr error;
  std::thread::id thread;
};

class NSWorkspaceTest : public testing::DesktopTest {
 protected:
  // Runs an asynchronous operation and waits for its one completion.
  template <class Start>
  Completion completed(Start start) {
    auto done = std::make_shared<std::promise<Completion>>();
    auto calls = std::make_shared<std::atomic<int>>(0);
    start([done, calls](const std::shared_ptr<NSRunningApplication>& app, const ErrorPtr& error) {
      if (calls->fetch_add(1) == 0) done->set_value({app, error, std::this_thread::get_id()});
    });
    auto future = done->get_future();
    EXPECT_EQ(future.wait_for(testing::kTimeout), std::future_status::ready);
    if (future.wait_for(std::chrono::seconds(0)) != std::future_status::ready) return {};
    Completion result = future.get();
    EXPECT_EQ(calls->load(), 1);
    return result;
  }

  // A desktop entry running `program` with `exec` arguments.
  std::string writeEntry(const std::string& path, const std::string& exec,
                         const std::string& extra = "") {
    write(path, "[Desktop Entry]\nType=Application\nName=Recorder\nExec=" + exec + "\n" + extra);
    return path;
  }

  // A program that records its arguments and $KIVI_MARK to `name`.out.
  void writeRecorder(const std::string& name) {
    writeScript(name, "{ printf '%s\\n' \"$@\"; echo \"mark=$KIVI_MARK\"; } > " + dir_ + "/" +
                          name + ".tmp && /bin/mv " + dir_ + "/" + name + ".tmp " + dir_ + "/" +
                          name + ".out");
  }

  std::shared_ptr<NSWorkspace> workspace_ = NSWorkspace::sharedWorkspace();
};

void expectCocoaError(const ErrorPtr& error, std::int64_t code) {
  ASSERT_NE(error, nullptr);
  EXPECT_EQ(error->domain(), CocoaErrorDomain);
  EXPECT_EQ(error->code(), code) << error->description();
}

TEST_F(NSWorkspaceTest, ThePortalOpensURLsAndFilesByDescriptor) {
  writeXdgOpen();
  ASSERT_NO_FATAL_FAILURE(
      startService("portal_mock.py", kPortal, R"({"record": ")" + dir_ + R"(/opened"})"));
  EXPECT_TRUE(workspace_->openURL(URL::URLWithString("https://example.com/a b?q=1")));
  EXPECT_TRUE(logShows(kPortal, R"(OpenURI "" "https://example.com/a%20b?q=1" {})"));

  const std::string file = dir_ + "/ä file.txt";
  write(file, "x");
  const Completion done = completed([&](NSWorkspaceCompletionHandler handler) {
    workspace_->openURL(URL::fileURLWithPath(file), {}, std::move(handler));
  });
  EXPECT_EQ(done.error, nullptr);
  EXPECT_EQ(done.application, nullptr);
  EXPECT_NE(done.thread, std::this_thread::get_id());
  EXPECT_EQ(read(dir_ + "/opened"), file + "\n");
  // With a portal there, xdg-open is never asked.
  EXPECT_FALSE(std::filesystem::exists(dir_ + "/xdg-open.args"));

  // A file that is not there reaches nobody.
  const Completion missing = completed([&](NSWorkspaceCompletionHandler handler) {
    workspace_->openURL(URL::fileURLWithPath(dir_ + "/gone.txt"), {}, std::move(handler));
  });
  expectCocoaError(missing.error, FileReadNoSuchFileError);
  EXPECT_EQ(missing.error->userInfo().at(FilePathErrorKey), Value(dir_ + "/gone.txt"));
  EXPECT_EQ(log(kPortal).find("OpenFile"), log(kPortal).rfind("OpenFile"));
}

TEST_F(NSWorkspaceTest, WithoutAPortalXdgOpenGetsTheURLOrPath) {
  writeXdgOpen();
  const std::string file = dir_ + "/notes.txt";
  write(file, "x");
  EXPECT_TRUE(workspace_->openURL(URL::URLWithString("mailto:ana@example.com")));
  EXPECT_TRUE(workspace_->openURL(URL::fileURLWithPath(file)));
  EXPECT_EQ(read(dir_ + "/xdg-open.args"), "mailto:ana@example.com\n" + file + "\n");

  writeXdgOpen(4);
  expectCocoaError(workspace_->openURLReturningError(URL::URLWithString("foo:bar")),
                   FeatureUnsupportedError);
  std::filesystem::remove(dir_ + "/bin/xdg-open");
  const ErrorPtr none = workspace_->openURLReturningError(URL::URLWithString("https://a.example"));
  expectCocoaError(none, FeatureUnsupportedError);
  EXPECT_NE(none->localizedDescription().find("neither a desktop portal nor xdg-open"),
            std::string::npos);
  EXPECT_FALSE(workspace_->openURL(nullptr));

  // No bus at all is the same as no portal.
  writeXdgOpen();
  setVariable("DBUS_SESSION_BUS_ADDRESS", "unix:path=" + dir_ + "/no-bus");
  EXPECT_TRUE(workspace_->openURL(URL::URLWithString("https://b.example")));
  EXPECT_NE(read(dir_ + "/xdg-open.args").find("https://b.example"), std::string::npos);
}

TEST_F(NSWorkspaceTest, ServicesThatNeverAnswerFailWithinTheWait) {
  writeXdgOpen();
  ASSERT_NO_FATAL_FAILURE(startService("portal_mock.py", kPortal, R"({"silent": true})"));
  ASSERT_NO_FATAL_FAILURE(
      startService("file_manager_mock.py", kFileManager, R"({"silent": true})"));
  const auto start = std::chrono::steady_clock::now();
  ErrorPtr error;
  EXPECT_TRUE(testing::returnsWithin(
      [&] { error = workspace_->openURLReturningError(URL::URLWithString("https://a.example")); }));
  EXPECT_GE(std::chrono::steady_clock::now() - start,
            kNSWorkspaceTimeout - std::chrono::milliseconds(100));
  expectCocoaError(error, FeatureUnsupportedError);
  EXPECT_NE(error->localizedDescription().find("did not answer in time"), std::string::npos);

  const std::string file = dir_ + "/f";
  write(file, "");
  EXPECT_TRUE(testing::returnsWithin([&] {
    error = workspace_->activateFileViewerSelectingURLsReturningError({URL::fileURLWithPath(file)});
  }));
  expectCocoaError(error, FeatureUnsupportedError);
  // A silent service is a failure, not a reason to try xdg-open.
  EXPECT_FALSE(std::filesystem::exists(dir_ + "/xdg-open.args"));
}

TEST_F(NSWorkspaceTest, TheFileManagerSelectsItemsOrXdgOpenShowsTheFolder) {
  writeXdgOpen();
  const std::string sub = dir_ + "/docs";
  write(sub + "/a.txt", "");
  write(sub + "/b c.txt", "");
  workspace_->activateFileViewerSelectingURLs({});  // nothing to show, nobody asked
  // No file manager: the folder of the first item.
  workspace_->activateFileViewerSelectingURLs(
      {URL::fileURLWithPath(sub + "/a.txt"), URL::fileURLWithPath(dir_ + "/x")});
  EXPECT_EQ(read(dir_ + "/xdg-open.args"), sub + "\n");

  ASSERT_NO_FATAL_FAILURE(startService("file_manager_mock.py", kFileManager));
  EXPECT_EQ(
      workspace_->activateFileViewerSelectingURLsReturningError(
          {URL::fileURLWithPath(sub + "/a.txt"), nullptr, URL::fileURLWithPath(sub + "/b c.txt")}),
      nullptr);
  EXPECT_TRUE(logShows(kFileManager, "ShowItems [\"file://" + sub + "/a.txt\", \"file://" + sub +
                                         "/b%20c.txt\"] \"\""));
  EXPECT_EQ(read(dir_ + "/xdg-open.args"), sub + "\n");
}

TEST_F(NSWorkspaceTest, ApplicationsAreFoundByIdInTheDataDirectoriesInOrder) {
  const std::string home = dir_ + "/home/applications/";
  const std::string data = dir_ + "/data/applications/";
  writeEntry(data + "org.example.Viewer.desktop", "viewer %U");
  writeEntry(home + "org.example.Editor.desktop", "editor");
  writeEntry(data + "org.example.Editor.desktop", "editor");
  writeEntry(data + "org/example-Tool.desktop", "tool");
  writeEntry(home + "org.example.Gone.desktop", "gone", "Hidden=true\n");
  write(data + "org.example.Broken.desktop", "not a desktop entry\n");

  auto found = [&](const std::string& id) {
    const URLPtr url = workspace_->URLForApplicationWithBundleIdentifier(id);
    return url ? url->fileSystemRepresentation().value_or("?") : std::string("null");
  };
  EXPECT_EQ(found("org.example.Viewer"), data + "org.example.Viewer.desktop");
  EXPECT_EQ(found("org.example.Editor"), home + "org.example.Editor.desktop");
  EXPECT_EQ(found("org-example-Tool"), data + "org/example-Tool.desktop");
  EXPECT_EQ(found("org.example.Gone"), "null");
  EXPECT_EQ(found("org.example.Broken"), "null");
  EXPECT_EQ(found("org.example.Missing"), "null");
  EXPECT_EQ(found(""), "null");
  EXPECT_EQ(found("../data/applications/org.example.Viewer"), "null");

  // The defaults when the variables are unset: ~/.local/share and /usr/share.
  ::unsetenv("XDG_DATA_HOME");
  ::unsetenv("XDG_DATA_DIRS");
  setVariable("HOME", dir_);
  writeEntry(dir_ + "/.local/share/applications/org.example.Home.desktop", "home");
  EXPECT_EQ(found("org.example.Home"),
            dir_ + "/.local/share/applications/org.example.Home.desktop");
  EXPECT_EQ(found("org.example.Viewer"), "null");
}

TEST_F(NSWorkspaceTest, LaunchesTheEntryWithURLsArgumentsAndEnvironment) {
  writeRecorder("recorder");
  const std::string entry = writeEntry(dir_ + "/data/applications/org.example.Recorder.desktop",
                                       "recorder --from-entry %F");
  const std::string file = dir_ + "/in put.txt";
  write(file, "");
  NSWorkspaceOpenConfiguration configuration;
  configuration.arguments = {"--flag", "two words", "100% \"sure\" $HOME `x` \\"};
  configuration.environment["KIVI_MARK"] = "set by the host";
  const Completion done = completed([&](NSWorkspaceCompletionHandler handler) {
    workspace_->openURLs({URL::fileURLWithPath(file)},
                         workspace_->URLForApplicationWithBundleIdentifier("org.example.Recorder"),
                         configuration, std::move(handler));
  });
  EXPECT_EQ(done.error, nullptr);
  ASSERT_TRUE(eventually([&] { return std::filesystem::exists(dir_ + "/recorder.out"); }));
  EXPECT_EQ(read(dir_ + "/recorder.out"), "--from-entry\n" + file +
                                              "\n--flag\ntwo words\n100% \"sure\" $HOME `x` \\\n" +
                                              "mark=set by the host\n");
  if (done.application) {
    EXPECT_GT(done.application->processIdentifier(), 0);
  }

  // By id, without URLs or a configuration.
  std::filesystem::remove(dir_ + "/recorder.out");
  const Completion byId = completed([&](NSWorkspaceCompletionHandler handler) {
    workspace_->openApplicationAtURL(URL::URLWithString("org.example.Recorder.desktop"), {},
                                     std::move(handler));
  });
  EXPECT_EQ(byId.error, nullptr);
  ASSERT_TRUE(eventually([&] { return std::filesystem::exists(dir_ + "/recorder.out"); }));
  EXPECT_EQ(read(dir_ + "/recorder.out"), "--from-entry\nmark=\n");
}

TEST_F(NSWorkspaceTest, ALaunchedApplicationIsHandedBackWhileItRuns) {
  writeScript("sleeper", "echo $$ > " + dir_ + "/sleeper.pid; exec /bin/sleep 30");
  writeEntry(dir_ + "/data/applications/org.example.Sleeper.desktop", "sleeper");
  const Completion done = completed([&](NSWorkspaceCompletionHandler handler) {
    workspace_->openApplicationAtURL(URL::URLWithString("org.example.Sleeper"), {},
                                     std::move(handler));
  });
  EXPECT_EQ(done.error, nullptr);
  ASSERT_NE(done.application, nullptr);
  ASSERT_TRUE(eventually([&] { return !read(dir_ + "/sleeper.pid").empty(); }));
  EXPECT_EQ(std::to_string(done.application->processIdentifier()) + "\n",
            read(dir_ + "/sleeper.pid"));
  ::kill(done.application->processIdentifier(), SIGKILL);
}

TEST_F(NSWorkspaceTest, ApplicationsThatCannotBeLaunchedFailWithTheReason) {
  writeEntry(dir_ + "/data/applications/org.example.NoProgram.desktop", "no-such-program");
  writeEntry(dir_ + "/data/applications/org.example.Link.desktop", "x",
             "Type=Link\nURL=https://a\n");
  write(dir_ + "/not-an-entry.desktop", "garbage");
  const struct {
    URLPtr url;
    std::int64_t code;
  } rows[] = {
      {URL::fileURLWithPath(dir_ + "/missing.desktop"), FileReadNoSuchFileError},
      {URL::URLWithString("org.example.Unknown"), FileNoSuchFileError},
      {nullptr, FileNoSuchFileError},
      {URL::fileURLWithPath(dir_ + "/not-an-entry.desktop"), FileReadCorruptFileError},
      {URL::URLWithString("https://example.com/app.desktop"), FeatureUnsupportedError},
      {URL::URLWithString("org.example.NoProgram"), FileReadCorruptFileError},
  };
  for (const auto& row : rows) {
    SCOPED_TRACE(row.url ? row.url->absoluteString() : "null");
    const Completion done = completed([&](NSWorkspaceCompletionHandler handler) {
      workspace_->openApplicationAtURL(row.url, {}, std::move(handler));
    });
    expectCocoaError(done.error, row.code);
    EXPECT_EQ(done.application, nullptr);
  }
  // A null completion is simply not called.
  workspace_->openApplicationAtURL(nullptr, {}, nullptr);
  workspace_->openURL(nullptr, {}, nullptr);
}

TEST_F(NSWorkspaceTest, LeavesNoDescriptorOpen) {
  writeXdgOpen();
  ASSERT_NO_FATAL_FAILURE(startService("file_manager_mock.py", kFileManager));
  const std::string file = dir_ + "/f";
  write(file, "");
  auto round = [&] {
    workspace_->openURL(URL::URLWithString("https://a.example"));
    workspace_->openURL(URL::fileURLWithPath(file));
    workspace_->activateFileViewerSelectingURLs({URL::fileURLWithPath(file)});
  };
  round();  // GLib's own threads and wakeup descriptors come once
  const std::size_t before = testing::openDescriptors();
  for (int i = 0; i < 3; ++i) round();
  // GLib closes a finished child's process descriptor on its own thread,
  // just after the wait for the child returned.
  EXPECT_TRUE(eventually([&] { return testing::openDescriptors() <= before; }))
      << testing::openDescriptors() << " open, " << before << " before";
  workspace_->noteFileSystemChanged(file);
}

}  // namespace
}  // namespace kivi

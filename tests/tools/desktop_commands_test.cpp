// `kivi open` and `kivi notify` against a private session bus and a scripted
// xdg-open: what they ask of the desktop, and how they fail without it.
#include <sys/wait.h>

#include <cstdlib>
#include <string>
#include <vector>

#include "desktop/desktop_fixture.h"
#include "tools/tool_run.h"

namespace kivi {
namespace {

using testing::ToolRun;

class DesktopCommandsTest : public testing::DesktopTest {
 protected:
  // Runs the tool in this test's environment (its bus, its $PATH); killed
  // after 20 seconds (exit 124).
  ToolRun kivi(const std::vector<std::string>& args) { return testing::kivi(args); }
};

TEST_F(DesktopCommandsTest, OpenHandsURLsAndPathsToTheDesktop) {
  writeXdgOpen();
  write(dir_ + "/report.pdf", "");
  EXPECT_EQ(kivi({"open", "https://example.com/x"}).exit, 0);
  EXPECT_EQ(kivi({"open", dir_ + "/report.pdf"}).exit, 0);
  EXPECT_EQ(read(dir_ + "/xdg-open.args"), "https://example.com/x\n" + dir_ + "/report.pdf\n");

  ASSERT_NO_FATAL_FAILURE(startService("file_manager_mock.py", "org.freedesktop.FileManager1"));
  EXPECT_EQ(kivi({"open", "--reveal", dir_ + "/report.pdf"}).exit, 0);
  EXPECT_TRUE(
      logShows("org.freedesktop.FileManager1", "ShowItems [\"file://" + dir_ + "/report.pdf\"]"));
}

TEST_F(DesktopCommandsTest, OpenFailsWithTheReason) {
  ToolRun run = kivi({"open", "https://example.com"});
  EXPECT_EQ(run.exit, 1);
  EXPECT_EQ(run.err,
            "kivi open: No application can open “https://example.com”: there is neither a "
            "desktop portal nor xdg-open. (NSCocoaErrorDomain 3328)\n");
  run = kivi({"open", dir_ + "/missing.txt"});
  EXPECT_EQ(run.exit, 1);
  EXPECT_NE(run.err.find("(NSCocoaErrorDomain 260)"), std::string::npos) << run.err;
  writeXdgOpen(3);
  EXPECT_EQ(kivi({"open", "https://example.com"}).exit, 1);
  EXPECT_EQ(kivi({"open"}).exit, 2);
  EXPECT_EQ(kivi({"open", "a", "b"}).exit, 2);
  EXPECT_EQ(kivi({"open", "--reveal"}).exit, 2);
}

TEST_F(DesktopCommandsTest, NotifyShowsANotificationOrSaysWhyNot) {
  ToolRun run = kivi({"notify", "Build done"});
  EXPECT_EQ(run.exit, 1);
  EXPECT_EQ(run.err, "kivi notify: No notification server is running. (UNErrorDomain 1)\n");

  ASSERT_NO_FATAL_FAILURE(startService("notification_daemon", "org.freedesktop.Notifications"));
  EXPECT_EQ(kivi({"notify", "--sound", "Build done", "All 12 targets"}).exit, 0);
  EXPECT_TRUE(logShows("org.freedesktop.Notifications",
                       "Notify \"kivi\" 0 \"\" \"Build done\" \"All 12 targets\" [\"default\", "
                       "\"\"] {\"sound-name\": \"message-new-instant\"} -1"));
  EXPECT_EQ(kivi({"notify"}).exit, 2);
  EXPECT_EQ(kivi({"notify", "a", "b", "c"}).exit, 2);
  EXPECT_EQ(kivi({"notify", "--bogus", "a"}).exit, 2);
}

}  // namespace
}  // namespace kivi

#include "kivi/process/ns_running_application.h"

#include <gtest/gtest.h>
#include <unistd.h>

#include <algorithm>
#include <set>

#include "fake_root.h"

namespace kivi {
namespace {

using testing::FakeRoot;
using namespace std::string_literals;

// A /proc/<pid>/stat line: command `name`, state `state`, start time
// `start` ticks after boot.
std::string statLine(int pid, const std::string& name, long start, char state = 'S') {
  std::string line = std::to_string(pid) + " (" + name + ") " + state;
  for (int field = 4; field <= 21; ++field) line += " 0";
  return line + " " + std::to_string(start) + " 0 0\n";
}

void addProcess(const FakeRoot& root, int pid, const std::string& cgroupUnit,
                const std::string& environ = {}, char state = 'S') {
  const std::string dir = "/proc/" + std::to_string(pid);
  root.write(dir + "/stat", statLine(pid, "proc (" + std::to_string(pid) + ")", 500, state));
  root.write(dir + "/cgroup",
             "0::/user.slice/user-1000.slice/user@1000.service/app.slice/" + cgroupUnit + "\n");
  if (!environ.empty()) root.write(dir + "/environ", environ);
}

std::set<std::int32_t> pids(const std::vector<std::shared_ptr<NSRunningApplication>>& apps) {
  std::set<std::int32_t> out;
  for (const auto& app : apps) out.insert(app->processIdentifier());
  return out;
}

TEST(NSRunningApplication, FindsApplicationsByTheirUnitOrLaunchEnvironment) {
  FakeRoot root;
  root.write("/proc/stat", "cpu 1 2 3\nbtime 1700000000\n");
  addProcess(root, 100, "app-gnome-org.gnome.TextEditor-4123.scope");
  addProcess(root, 101, "app-org.gnome.TextEditor@c3f0a1.service");
  addProcess(root, 102, "app-flatpak-org.gnome.Maps-55.scope");
  addProcess(
      root, 103, "session-2.scope",
      "A=1\0GIO_LAUNCHED_DESKTOP_FILE=/usr/share/applications/org.gnome.TextEditor.desktop\0"s);
  addProcess(root, 104, "session-2.scope");
  addProcess(root, 105, "app-gnome-my\\x2dapp-77.scope");
  addProcess(root, 106, "app-gnome-org.gnome.TextEditor-9.scope", {}, 'Z');  // has ended
  addProcess(root, 107, "app-kde-org.kde.dolphin@1.service");
  addProcess(root, 108, "dbus-:1.2-org.gnome.Nautilus@0.service");
  root.write("/proc/self/stat", "not a process");
  root.write("/proc/109x/stat", statLine(109, "x", 1));

  auto apps = NSRunningApplication::classObject();
  EXPECT_EQ(pids(apps->runningApplicationsWithBundleIdentifier("org.gnome.TextEditor")),
            (std::set<std::int32_t>{100, 101, 103}));
  EXPECT_EQ(pids(apps->runningApplicationsWithBundleIdentifier("org.gnome.Maps")),
            (std::set<std::int32_t>{102}));
  EXPECT_EQ(pids(apps->runningApplicationsWithBundleIdentifier("my-app")),
            (std::set<std::int32_t>{105}));
  EXPECT_EQ(pids(apps->runningApplicationsWithBundleIdentifier("org.kde.dolphin")),
            (std::set<std::int32_t>{107}));
  EXPECT_EQ(pids(apps->runningApplicationsWithBundleIdentifier("org.gnome.Nautilus")),
            (std::set<std::int32_t>{108}));
  for (const char* none : {"", "gnome", "org.gnome", "session-2.scope", "4123"})
    EXPECT_TRUE(apps->runningApplicationsWithBundleIdentifier(none).empty()) << none;

  auto plain = NSRunningApplication::runningApplicationWithProcessIdentifier(104);
  ASSERT_NE(plain, nullptr);
  EXPECT_EQ(plain->bundleIdentifier(), std::nullopt);
  EXPECT_EQ(plain->localizedName(), "proc (104)");
  EXPECT_EQ(NSRunningApplication::runningApplicationWithProcessIdentifier(99), nullptr);
  EXPECT_EQ(NSRunningApplication::runningApplicationWithProcessIdentifier(-1), nullptr);
}

TEST(NSRunningApplication, DetailsAndTermination) {
  FakeRoot root;
  root.write("/proc/stat", "cpu 1 2 3\nbtime 1700000000\n");
  addProcess(root, 100, "app-gnome-org.gnome.TextEditor-4123.scope");
  root.link("/proc/100/exe", "/usr/bin/gnome-text-editor");

  auto app = NSRunningApplication::runningApplicationWithProcessIdentifier(100);
  ASSERT_NE(app, nullptr);
  EXPECT_EQ(app->bundleIdentifier(), "org.gnome.TextEditor");
  EXPECT_EQ(app->localizedName(), "TextEditor");
  ASSERT_NE(app->executableURL(), nullptr);
  EXPECT_EQ(app->executableURL()->path(), "/usr/bin/gnome-text-editor");
  ASSERT_TRUE(app->launchDate());
  EXPECT_DOUBLE_EQ(app->launchDate()->timeIntervalSince1970,
                   1700000000.0 + 500.0 / static_cast<double>(::sysconf(_SC_CLK_TCK)));
  EXPECT_FALSE(app->isTerminated());
  EXPECT_FALSE(app->terminate());  // never signals anything under a fake table
  EXPECT_FALSE(app->forceTerminate());

  // The pid taken by another process (another start time), then gone.
  root.write("/proc/100/stat", statLine(100, "other", 900));
  EXPECT_TRUE(app->isTerminated());
  root.remove("/proc/100");
  EXPECT_TRUE(app->isTerminated());
}

TEST(NSRunningApplication, CurrentApplicationUsesTheSameRules) {
  FakeRoot root;
  addProcess(root, static_cast<int>(::getpid()), "app-gnome-org.example.Tests-12.scope");
  auto me = NSRunningApplication::currentApplication();
  ASSERT_NE(me, nullptr);
  EXPECT_EQ(me->processIdentifier(), ::getpid());
  EXPECT_EQ(me->bundleIdentifier(), "org.example.Tests");

  root.remove("/proc");
  auto unknown = NSRunningApplication::currentApplication();
  ASSERT_NE(unknown, nullptr);
  EXPECT_EQ(unknown->processIdentifier(), ::getpid());
  EXPECT_EQ(unknown->bundleIdentifier(), std::nullopt);
}

}  // namespace
}  // namespace kivi

// NSBundle: installation prefixes with desktop entries, and the running test
// binary's own bundle (read in a child process, since the main bundle is read
// once per process).
#include "kivi/desktop/ns_bundle.h"

#include <gtest/gtest.h>
#include <sys/utsname.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>

#include "child_process.h"

namespace kivi {
namespace {

std::int64_t thisMachine() {
  utsname name{};
  ::uname(&name);
  const std::string machine = name.machine;
  if (machine == "x86_64") return NSBundleExecutableArchitectureX86_64;
  if (machine == "aarch64") return NSBundleExecutableArchitectureARM64;
  return -1;
}

std::string text(const Value& value) {
  const String* s = value.asString();
  return s ? s->str() : "<" + value.description() + ">";
}

std::string testBinary() { return std::filesystem::read_symlink("/proc/self/exe").string(); }

class NSBundleTest : public ::testing::Test {
 protected:
  void SetUp() override {
    char pattern[] = "/tmp/kivi-bundle-XXXXXX";
    ASSERT_NE(::mkdtemp(pattern), nullptr);
    dir_ = pattern;
  }
  void TearDown() override { std::filesystem::remove_all(dir_); }

  void write(const std::string& relative, const std::string& content) {
    const auto path = std::filesystem::path(dir_) / relative;
    std::filesystem::create_directories(path.parent_path());
    std::ofstream(path) << content;
  }

  std::string dir_;
};

TEST_F(NSBundleTest, APrefixIsDescribedByItsFirstDesktopEntry) {
  write("share/applications/org.example.Viewer.desktop",
        "[Desktop Entry]\nType=Application\nName=Viewer\nName[de]=Betrachter\n"
        "Exec=viewer --new %U\nIcon=org.example.Viewer\nX-AppVersion=2.4.1\n"
        "Categories=Graphics;Viewer;\nVersion=1.5\n");
  write("share/applications/zz.Other.desktop", "[Desktop Entry]\nName=Other\nExec=other\n");
  std::filesystem::create_directories(dir_ + "/bin");
  std::filesystem::copy_file(testBinary(), dir_ + "/bin/viewer");

  const auto bundle = NSBundle::bundleWithPath(dir_ + "/bin/../");
  ASSERT_NE(bundle, nullptr);
  EXPECT_EQ(bundle->bundlePath(), dir_);
  EXPECT_EQ(bundle->bundleIdentifier(), "org.example.Viewer");
  EXPECT_EQ(bundle->executablePath(), dir_ + "/bin/viewer");
  if (thisMachine() > 0) {
    EXPECT_EQ(bundle->executableArchitectures(), std::vector<std::int64_t>{thisMachine()});
  }
  const struct {
    const char* key;
    std::string value;
  } rows[] = {
      {"CFBundleIdentifier", "org.example.Viewer"},
      {"CFBundleName", "Viewer"},
      {"CFBundleDisplayName", "Viewer"},
      {"CFBundleExecutable", "viewer"},
      {"CFBundleShortVersionString", "2.4.1"},
      {"CFBundleVersion", "2.4.1"},
      {"Exec", "viewer --new %U"},
      {"Categories", "Graphics;Viewer;"},
      {"Version", "1.5"},
  };
  for (const auto& row : rows) {
    EXPECT_EQ(text(bundle->objectForInfoDictionaryKey(row.key)), row.value) << row.key;
  }
  EXPECT_TRUE(bundle->objectForInfoDictionaryKey("NoSuchKey").isNull());
}

TEST_F(NSBundleTest, WhatCannotBeReadIsAbsent) {
  EXPECT_EQ(NSBundle::bundleWithPath(dir_ + "/missing"), nullptr);
  EXPECT_EQ(NSBundle::bundleWithPath(""), nullptr);
  write("file", "");
  EXPECT_EQ(NSBundle::bundleWithPath(dir_ + "/file"), nullptr);

  // No entry: no identifier, no executable, only what is always there.
  auto bare = NSBundle::bundleWithPath(dir_);
  ASSERT_NE(bare, nullptr);
  EXPECT_EQ(bare->bundleIdentifier(), std::nullopt);
  EXPECT_EQ(bare->executableArchitectures(), std::nullopt);
  EXPECT_TRUE(bare->infoDictionary().empty());

  // Hidden and broken entries are skipped; an executable that is no ELF file
  // (or is truncated) has no architecture.
  write("share/applications/a.Hidden.desktop", "[Desktop Entry]\nExec=x\nHidden=true\n");
  write("share/applications/b.Broken.desktop", "Exec=x\n");
  write("share/applications/sub/c.Script.desktop", "[Desktop Entry]\nTryExec=script\nExec=y\n");
  write("bin/script", "#!/bin/sh\n");
  auto script = NSBundle::bundleWithPath(dir_);
  EXPECT_EQ(script->bundleIdentifier(), "sub-c.Script");
  EXPECT_EQ(script->executablePath(), dir_ + "/bin/script");
  EXPECT_EQ(script->executableArchitectures(), std::nullopt);
  write("bin/script",
        "\x7f"
        "ELF\x02\x01");
  EXPECT_EQ(NSBundle::bundleWithPath(dir_)->executableArchitectures(), std::nullopt);
}

// Run by MainBundleIsTheRunningExecutablesEntry in a child process. With
// KIVI_BUNDLE_CHILD_LAUNCHED, it plays a process GIO launched from that entry.
TEST(NSBundleChild, PrintMainBundle) {
  if (!std::getenv("KIVI_BUNDLE_CHILD")) GTEST_SKIP() << "only run as a child";
  if (const char* entry = std::getenv("KIVI_BUNDLE_CHILD_LAUNCHED")) {
    ::setenv("GIO_LAUNCHED_DESKTOP_FILE", entry, 1);
    ::setenv("GIO_LAUNCHED_DESKTOP_FILE_PID", std::to_string(::getpid()).c_str(), 1);
  }
  auto bundle = NSBundle::mainBundle();
  EXPECT_EQ(bundle, NSBundle::mainBundle());
  const Value name = bundle->objectForInfoDictionaryKey("CFBundleName");
  std::printf("PATH=%s\nID=%s\nNAME=%s\nEXECUTABLE=%s\n", bundle->bundlePath().c_str(),
              bundle->bundleIdentifier().value_or("<none>").c_str(),
              name.isNull() ? "<none>" : text(name).c_str(),
              text(bundle->objectForInfoDictionaryKey("CFBundleExecutable")).c_str());
  std::fflush(stdout);
}

TEST_F(NSBundleTest, MainBundleIsTheRunningExecutablesEntry) {
  const std::string binary = testBinary();
  const std::string name = std::filesystem::path(binary).filename();
  // Data dirs in order; the first entry naming this executable wins, whether
  // by bare name or by path. Entries for other programs do not count.
  write("home/applications/a.Other.desktop",
        "[Desktop Entry]\nName=Other\nExec=other " + name + "\n");
  write("data1/applications/org/example/Tests.desktop",
        "[Desktop Entry]\nName=Tests\nExec=" + name + " --gtest_list_tests\n");
  write("data2/applications/b.ByPath.desktop",
        "[Desktop Entry]\nName=ByPath\nExec=" + binary + "\n");
  write("elsewhere/c.Launched.desktop", "[Desktop Entry]\nName=Launched\nExec=whatever\n");
  auto run = [&](const std::string& dataDirs, const std::string& launchedFrom = "",
                 const std::string& pid = "") {
    std::vector<std::string> environment = {
        "KIVI_BUNDLE_CHILD=1", "XDG_DATA_HOME=" + dir_ + "/home", "XDG_DATA_DIRS=" + dataDirs,
        "GIO_LAUNCHED_DESKTOP_FILE=" + launchedFrom, "GIO_LAUNCHED_DESKTOP_FILE_PID=" + pid};
    if (!launchedFrom.empty() && pid.empty()) {
      environment.push_back("KIVI_BUNDLE_CHILD_LAUNCHED=" + launchedFrom);
    }
    auto result = testing::runChild({binary, "--gtest_filter=NSBundleChild.PrintMainBundle"},
                                    environment, dir_ + "/child.out");
    EXPECT_EQ(result.exitCode, 0) << result.output;
    return result.output;
  };
  const std::string data12 = dir_ + "/data1:" + dir_ + "/data2";
  std::string out = run(data12);
  EXPECT_EQ(testing::printed(out, "PATH"), std::filesystem::path(binary).parent_path().string());
  EXPECT_EQ(testing::printed(out, "ID"), "org-example-Tests");
  EXPECT_EQ(testing::printed(out, "NAME"), "Tests");
  EXPECT_EQ(testing::printed(out, "EXECUTABLE"), name);

  EXPECT_EQ(testing::printed(run(dir_ + "/data2:" + dir_ + "/data1"), "ID"), "b.ByPath");

  // Launched by GIO from an entry: that entry, but only for the pid GIO named.
  const std::string launched = dir_ + "/elsewhere/c.Launched.desktop";
  out = run(data12, launched);
  EXPECT_EQ(testing::printed(out, "ID"), "c.Launched");
  EXPECT_EQ(testing::printed(out, "NAME"), "Launched");
  EXPECT_EQ(testing::printed(run(data12, launched, "1"), "ID"), "org-example-Tests");

  out = run(dir_ + "/empty");
  EXPECT_EQ(testing::printed(out, "ID"), "<none>");
  EXPECT_EQ(testing::printed(out, "NAME"), "<none>");
  EXPECT_EQ(testing::printed(out, "EXECUTABLE"), name);
}

}  // namespace
}  // namespace kivi

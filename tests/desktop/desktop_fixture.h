// A desktop of the test's own: a private session bus, scripted services on
// it, a directory of scripts as the whole $PATH, and temporary XDG data
// directories. Nothing reaches the real desktop: the environment points
// everything at these before a test touches the workspace or the center.
//
//   class MyTest : public kivi::testing::DesktopTest {};
//   TEST_F(MyTest, Opens) {
//     startService("portal_mock.py", "org.freedesktop.portal.Desktop");
//     writeScript("xdg-open", "exit 0");
//   }
#pragma once

#include <gtest/gtest.h>
#include <sys/stat.h>

#include <chrono>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <map>
#include <optional>
#include <string>
#include <thread>

#include "private_bus.h"
#include "test_support.h"

namespace kivi::testing {

class DesktopTest : public ::testing::Test {
 protected:
  void SetUp() override {
    if (!PrivateBus::available()) GTEST_SKIP() << "dbus-daemon is not installed";
    if (!std::filesystem::exists("/usr/lib/python3/dist-packages/dbusmock")) {
      GTEST_SKIP() << "python3-dbusmock is not installed";
    }
    ASSERT_TRUE(bus_.started());
    dir_ = bus_.directory();
    for (const char* sub : {"/bin", "/home/applications", "/data/applications"}) {
      std::filesystem::create_directories(dir_ + sub);
    }
    setVariable("DBUS_SESSION_BUS_ADDRESS", bus_.address());
    setVariable("PATH", dir_ + "/bin");
    setVariable("XDG_DATA_HOME", dir_ + "/home");
    setVariable("XDG_DATA_DIRS", dir_ + "/data");
  }

  void TearDown() override {
    for (const auto& [name, value] : saved_) {
      if (value) {
        ::setenv(name.c_str(), value->c_str(), 1);
      } else {
        ::unsetenv(name.c_str());
      }
    }
  }

  void setVariable(const std::string& name, const std::string& value) {
    if (!saved_.count(name)) {
      const char* old = std::getenv(name.c_str());
      saved_[name] = old ? std::optional<std::string>(old) : std::nullopt;
    }
    ::setenv(name.c_str(), value.c_str(), 1);
  }

  // Starts dbusmock with `script` (a file beside the tests, or one of
  // dbusmock's own templates) and waits until `name` is on the bus. Its
  // method calls are logged to log(`name`).
  void startService(const std::string& script, const std::string& name,
                    const std::string& parameters = "{}") {
    const auto local = std::filesystem::path(__FILE__).parent_path() / script;
    const std::string tmpl = std::filesystem::exists(local) ? local.string() : script;
    ASSERT_GT(bus_.spawn({"/usr/bin/python3", "-m", "dbusmock", "-t", tmpl, "-l",
                          dir_ + "/" + name + ".log", "-p", parameters}),
              0);
    ASSERT_EQ(
        runChild({"/usr/bin/gdbus", "wait", "--address", bus_.address(), "--timeout", "10", name})
            .exitCode,
        0);
  }

  std::string log(const std::string& name) const { return read(dir_ + "/" + name + ".log"); }

  // Waits until log(`name`) contains `text`.
  bool logShows(const std::string& name, const std::string& text) const {
    return eventually([&] { return log(name).find(text) != std::string::npos; });
  }

  // An executable /bin/sh script in the $PATH directory.
  std::string writeScript(const std::string& name, const std::string& body) {
    const std::string path = dir_ + "/bin/" + name;
    std::ofstream(path) << "#!/bin/sh\n" << body << "\n";
    ::chmod(path.c_str(), 0755);
    return path;
  }

  // xdg-open that appends each argument, one per line, to the file
  // `dir_/xdg-open.args`, then exits with `status`.
  void writeXdgOpen(int status = 0) {
    writeScript("xdg-open", "printf '%s\\n' \"$@\" >> " + dir_ + "/xdg-open.args\nexit " +
                                std::to_string(status));
  }

  static void write(const std::string& path, const std::string& text) {
    std::filesystem::create_directories(std::filesystem::path(path).parent_path());
    std::ofstream(path) << text;
  }

  static std::string read(const std::string& path) {
    std::ifstream in(path);
    return {std::istreambuf_iterator<char>(in), {}};
  }

  template <class Condition>
  static bool eventually(Condition condition) {
    const auto deadline = std::chrono::steady_clock::now() + kTimeout;
    while (!condition()) {
      if (std::chrono::steady_clock::now() > deadline) return false;
      std::this_thread::sleep_for(std::chrono::milliseconds(10));
    }
    return true;
  }

  PrivateBus bus_;
  std::string dir_;

 private:
  std::map<std::string, std::optional<std::string>> saved_;
};

}  // namespace kivi::testing

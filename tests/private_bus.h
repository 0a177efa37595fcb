// A private D-Bus daemon, started for a test and stopped with it, and the
// processes a test runs on it (a scripted service, a keyring daemon). Nothing
// reaches the machine's own system or session bus.
//
//   kivi::testing::PrivateBus bus;
//   ASSERT_TRUE(bus.started());
//   bus.spawn({"/usr/bin/python3", "-m", "dbusmock", "--template", "..."});
//   ::setenv("DBUS_SYSTEM_BUS_ADDRESS", bus.address().c_str(), 1);
#pragma once

#include <signal.h>
#include <sys/wait.h>
#include <unistd.h>

#include <chrono>
#include <cstdlib>
#include <filesystem>
#include <string>
#include <thread>
#include <vector>

#include "child_process.h"

namespace kivi::testing {

class PrivateBus {
 public:
  static constexpr const char* kDaemon = "/usr/bin/dbus-daemon";

  static bool available() { return ::access(kDaemon, X_OK) == 0; }

  PrivateBus() {
    char pattern[] = "/tmp/kivi-bus-XXXXXX";
    if (!::mkdtemp(pattern)) return;
    dir_ = pattern;
    address_ = "unix:path=" + dir_ + "/bus";
    const std::string config = dir_ + "/bus.conf";
    if (FILE* f = std::fopen(config.c_str(), "w")) {
      std::fprintf(f,
                   "<busconfig><type>session</type><listen>%s</listen>"
                   "<auth>EXTERNAL</auth><policy context=\"default\">"
                   "<allow send_destination=\"*\" eavesdrop=\"true\"/>"
                   "<allow eavesdrop=\"true\"/><allow own=\"*\"/></policy></busconfig>\n",
                   address_.c_str());
      std::fclose(f);
    }
    daemon_ = spawn({kDaemon, "--nofork", "--config-file=" + config});
    // Ready once the socket exists.
    const auto deadline = std::chrono::steady_clock::now() + std::chrono::seconds(10);
    while (!std::filesystem::exists(dir_ + "/bus") && std::chrono::steady_clock::now() < deadline) {
      std::this_thread::sleep_for(std::chrono::milliseconds(10));
    }
    started_ = std::filesystem::exists(dir_ + "/bus");
  }

  ~PrivateBus() {
    for (auto it = children_.rbegin(); it != children_.rend(); ++it) stop(*it);
    std::error_code ignored;
    if (!dir_.empty()) std::filesystem::remove_all(dir_, ignored);
  }

  PrivateBus(const PrivateBus&) = delete;
  PrivateBus& operator=(const PrivateBus&) = delete;

  bool started() const { return started_; }
  const std::string& address() const { return address_; }
  // A directory of the test's own, removed with the bus.
  const std::string& directory() const { return dir_; }

  // Starts a process with the bus as both its session and its system bus,
  // plus `environment` ("NAME=value", replacing inherited variables); stopped
  // (SIGTERM, then SIGKILL) with the bus. Answers its pid, or -1.
  pid_t spawn(const std::vector<std::string>& arguments,
              std::vector<std::string> environment = {}) {
    if (!address_.empty()) {
      environment.push_back("DBUS_SESSION_BUS_ADDRESS=" + address_);
      environment.push_back("DBUS_SYSTEM_BUS_ADDRESS=" + address_);
    }
    const pid_t pid = spawnChild(arguments, environment);
    if (pid > 0) children_.push_back(pid);
    return pid;
  }

 private:
  static void stop(pid_t pid) {
    if (pid <= 0) return;
    ::kill(pid, SIGTERM);
    for (int i = 0; i < 200; ++i) {
      if (::waitpid(pid, nullptr, WNOHANG) == pid) return;
      std::this_thread::sleep_for(std::chrono::milliseconds(10));
    }
    ::kill(pid, SIGKILL);
    ::waitpid(pid, nullptr, 0);
  }

  std::string dir_;
  std::string address_;
  pid_t daemon_ = -1;
  bool started_ = false;
  std::vector<pid_t> children_;
};

}  // namespace kivi::testing

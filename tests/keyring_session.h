// A gnome-keyring-daemon with an unlocked login keyring on a private session
// bus, for tests of the keychain and what is built on it. One keyring serves
// a whole test binary: sharedKeyring() starts it on first use and points this
// process at it; child processes get keyring.environment().
//
//   if (auto reason = kivi::testing::keyringSkipReason(); !reason.empty())
//     GTEST_SKIP() << reason;
//   ASSERT_EQ(kivi::testing::sharedKeyring().failure, "");
//   kivi::SecItemAdd(attributes, nullptr);   // lands in the private keyring
#pragma once

#include <sys/stat.h>
#include <unistd.h>

#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <string>
#include <vector>

#include "child_process.h"
#include "private_bus.h"

namespace kivi::testing {

inline constexpr const char* kKeyringDaemon = "/usr/bin/gnome-keyring-daemon";

// Why keyring tests cannot run here, or "".
inline std::string keyringSkipReason() {
  if (!PrivateBus::available()) return "dbus-daemon is not installed";
  if (::access(kKeyringDaemon, X_OK) != 0) return "gnome-keyring-daemon is not installed";
  if (::access("/usr/bin/gdbus", X_OK) != 0) return "gdbus is not installed";
  return "";
}

struct Keyring {
  PrivateBus bus;
  std::string runtime;  // its XDG_RUNTIME_DIR
  std::string failure;  // why it did not start, or ""

  Keyring() {
    if (!bus.started()) {
      failure = "the private bus did not start";
      return;
    }
    const std::string home = bus.directory() + "/home";
    runtime = bus.directory() + "/runtime";
    std::filesystem::create_directories(home + "/data");
    ::mkdir(runtime.c_str(), 0700);
    // The login keyring's password goes in on stdin.
    std::ofstream(bus.directory() + "/password") << "test";
    bus.spawn(
        {"/bin/sh", "-c",
         std::string("exec ") + kKeyringDaemon + " --foreground --components=secrets --unlock <" +
             bus.directory() + "/password >/dev/null"},
        {"HOME=" + home, "XDG_DATA_HOME=" + home + "/data", "XDG_RUNTIME_DIR=" + runtime});
    const ChildResult waited = runChild({"/usr/bin/gdbus", "wait", "--address", bus.address(),
                                         "--timeout", "10", "org.freedesktop.secrets"});
    if (waited.exitCode != 0) failure = "the keyring daemon did not appear on the bus";
  }

  // The environment that points a process at this keyring.
  std::vector<std::string> environment() const {
    return {"DBUS_SESSION_BUS_ADDRESS=" + bus.address(), "XDG_RUNTIME_DIR=" + runtime};
  }

  // Calls the Secret Service's `method` (on its service object) with
  // `arguments` in gdbus's text form, bypassing the library.
  ChildResult call(const std::string& method, const std::string& arguments) const {
    const std::string out = bus.directory() + "/call.out";
    return runChild({"/usr/bin/gdbus", "call", "--address", bus.address(), "--dest",
                     "org.freedesktop.secrets", "--object-path", "/org/freedesktop/secrets",
                     "--method", "org.freedesktop.Secret.Service." + method, arguments},
                    {}, out);
  }
};

// The binary's keyring, started on first use; this process talks to it.
inline Keyring& sharedKeyring() {
  static Keyring keyring;
  static const bool pointed = [] {
    for (const std::string& e : keyring.environment()) {
      const auto eq = e.find('=');
      ::setenv(e.substr(0, eq).c_str(), e.substr(eq + 1).c_str(), 1);
    }
    return true;
  }();
  (void)pointed;
  return keyring;
}

}  // namespace kivi::testing

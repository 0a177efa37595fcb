// KivApplicationPrefixProvider against a real gnome-keyring-daemon on a
// private session bus, shared by the whole binary. Children re-run this
// binary with KIVI_PREFIX_CHILD set, which makes PrefixProviderChild.Run ask
// for the prefix and print the answer.
#include "kivi/device/kiv_application_prefix_provider.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/stat.h>

#include <algorithm>
#include <chrono>
#include <filesystem>
#include <fstream>
#include <iostream>
#include <iterator>
#include <regex>
#include <string>
#include <thread>
#include <vector>

#include "kivi/security/keychain.h"
#include "private_bus.h"
#include "test_support.h"

namespace kivi {
namespace {

constexpr const char* kKeyringDaemon = "/usr/bin/gnome-keyring-daemon";
constexpr const char* kChildMode = "KIVI_PREFIX_CHILD";
constexpr const char* kChildBarrier = "KIVI_PREFIX_BARRIER";  // a directory

// Starts `arguments` with `environment` replacing inherited variables of the
// same names, stdout to `outputFile`. Answers its pid, or -1.
pid_t spawnChild(const std::vector<std::string>& arguments,
                 const std::vector<std::string>& environment, const std::string& outputFile) {
  std::vector<std::string> env = environment;
  for (char** e = environ; *e; ++e) {
    const std::string inherited = *e;
    const std::string name = inherited.substr(0, inherited.find('=') + 1);
    if (std::none_of(environment.begin(), environment.end(),
                     [&](const std::string& given) { return given.starts_with(name); })) {
      env.push_back(inherited);
    }
  }
  std::vector<char*> argv, envp;
  for (const auto& a : arguments) argv.push_back(const_cast<char*>(a.c_str()));
  argv.push_back(nullptr);
  for (const auto& e : env) envp.push_back(const_cast<char*>(e.c_str()));
  envp.push_back(nullptr);
  posix_spawn_file_actions_t actions;
  posix_spawn_file_actions_init(&actions);
  posix_spawn_file_actions_addopen(&actions, 1, outputFile.c_str(), O_WRONLY | O_CREAT | O_TRUNC,
                                   0600);
  pid_t pid = -1;
  const int spawned = ::posix_spawn(&pid, argv[0], &actions, nullptr, argv.data(), envp.data());
  posix_spawn_file_actions_destroy(&actions);
  return spawned == 0 ? pid : -1;
}

// Waits for the child with a deadline (then kills it); answers its stdout
// followed by "EXIT=<exit code, -1 when killed>".
std::string waitChild(pid_t pid, const std::string& outputFile) {
  if (pid <= 0) return "<not started>";
  const auto deadline = std::chrono::steady_clock::now() + std::chrono::seconds(30);
  int status = 0;
  while (::waitpid(pid, &status, WNOHANG) == 0) {
    if (std::chrono::steady_clock::now() > deadline) ::kill(pid, SIGKILL);
    std::this_thread::sleep_for(std::chrono::milliseconds(5));
  }
  std::ifstream in(outputFile);
  return std::string(std::istreambuf_iterator<char>(in), {}) +
         "\nEXIT=" + std::to_string(WIFEXITED(status) ? WEXITSTATUS(status) : -1) + "\n";
}

// The value printed by a child as "NAME=value" on a line of its own.
std::string printed(const std::string& output, const std::string& name) {
  std::smatch m;
  if (std::regex_search(output, m, std::regex("(^|\n)" + name + "=([^\n]*)"))) return m[2];
  return "<not printed>";
}

// A gnome-keyring-daemon with an unlocked login keyring on a private bus;
// this process is pointed at it on first use.
struct Keyring {
  testing::PrivateBus bus;
  std::string failure;  // why it did not start

  Keyring() {
    if (!bus.started()) {
      failure = "the private bus did not start";
      return;
    }
    const std::string home = bus.directory() + "/home";
    const std::string runtime = bus.directory() + "/runtime";
    std::filesystem::create_directories(home + "/data");
    ::mkdir(runtime.c_str(), 0700);
    // The password on stdin; env(1) rather than spawn's environment, which
    // would come after (and lose to) this process's own variables.
    std::ofstream(bus.directory() + "/password") << "test";
    bus.spawn({"/bin/sh", "-c",
               "exec /usr/bin/env HOME=" + home + " XDG_DATA_HOME=" + home +
                   "/data XDG_RUNTIME_DIR=" + runtime +
                   " DBUS_SESSION_BUS_ADDRESS=" + bus.address() + " " + kKeyringDaemon +
                   " --foreground --components=secrets --unlock <" + bus.directory() +
                   "/password >/dev/null"});
    const std::string out = bus.directory() + "/wait.out";
    const std::string waited =
        waitChild(spawnChild({"/usr/bin/gdbus", "wait", "--address", bus.address(), "--timeout",
                              "10", "org.freedesktop.secrets"},
                             {}, out),
                  out);
    if (printed(waited, "EXIT") != "0") {
      failure = "the keyring daemon did not appear on the bus";
      return;
    }
    ::setenv("DBUS_SESSION_BUS_ADDRESS", bus.address().c_str(), 1);
    ::setenv("XDG_RUNTIME_DIR", runtime.c_str(), 1);
  }
};

Keyring& sharedKeyring() {
  static Keyring keyring;
  return keyring;
}

const Dictionary kMarker{{kSecClass, kSecClassGenericPassword},
                         {kSecAttrAccount, "appIdentifierPrefix"},
                         {kSecAttrService, ""}};

class KivApplicationPrefixProviderTest : public ::testing::Test {
 protected:
  void SetUp() override {
    if (!testing::PrivateBus::available()) GTEST_SKIP() << "dbus-daemon is not installed";
    if (::access(kKeyringDaemon, X_OK) != 0) GTEST_SKIP() << "gnome-keyring-daemon is missing";
    ASSERT_EQ(sharedKeyring().failure, "");
    const OSStatus cleared = SecItemDelete(kMarker);
    ASSERT_TRUE(cleared == errSecSuccess || cleared == errSecItemNotFound) << cleared;
  }

  static std::string outputFile() {
    static int count = 0;
    return sharedKeyring().bus.directory() + "/child" + std::to_string(++count) + ".out";
  }
  static pid_t startChild(std::vector<std::string> environment,
                          const std::string& binary = "/proc/self/exe",
                          const std::string& output = outputFile()) {
    environment.push_back(std::string(kChildMode) + "=1");
    return spawnChild({binary, "--gtest_filter=PrefixProviderChild.Run"}, environment, output);
  }
  static std::string runChild(std::vector<std::string> environment,
                              const std::string& binary = "/proc/self/exe") {
    const std::string output = outputFile();
    return waitChild(startChild(std::move(environment), binary, output), output);
  }

  static std::size_t markers() {
    Value all;
    Dictionary query = kMarker;
    query[kSecMatchLimit] = Value(kSecMatchLimitAll);
    query[kSecReturnAttributes] = Value(true);
    if (SecItemCopyMatching(query, &all) != errSecSuccess || !all.asArray()) return 0;
    return all.asArray()->size();
  }
};

TEST_F(KivApplicationPrefixProviderTest, CreatesTheMarkerOnceAndAnswersTheGroupsFirstPart) {
  const std::string group = SecDefaultAccessGroup();
  const std::string team = group.substr(0, group.find('.'));
  ASSERT_EQ(team.size(), 10u) << group;

  ErrorPtr error = Error::create("stale", 1);
  EXPECT_EQ(KivApplicationPrefixProvider::applicationIdentifierPrefixWithError(&error), team);
  EXPECT_EQ(error, nullptr);
  Value marker;
  Dictionary query = kMarker;
  query[kSecReturnAttributes] = Value(true);
  ASSERT_EQ(SecItemCopyMatching(query, &marker), errSecSuccess);
  EXPECT_EQ(*marker.find(kSecAttrAccessible), Value(kSecAttrAccessibleAfterFirstUnlock));

  error = Error::create("stale", 1);
  EXPECT_EQ(KivApplicationPrefixProvider::applicationIdentifierPrefixWithError(&error), team);
  EXPECT_EQ(error, nullptr);
  EXPECT_EQ(KivApplicationPrefixProvider::applicationIdentifierPrefixWithError(nullptr), team);
  EXPECT_EQ(markers(), 1u);

  // An executable whose name has dots: the prefix ends at the first one.
  const std::string copy = sharedKeyring().bus.directory() + "/kivi.tests.device";
  std::filesystem::copy_file("/proc/self/exe", copy,
                             std::filesystem::copy_options::overwrite_existing);
  const std::string output = runChild({}, copy);
  std::filesystem::remove(copy);
  const std::string otherGroup = printed(output, "GROUP");
  EXPECT_TRUE(std::regex_match(otherGroup, std::regex("[0-9A-F]{10}\\.kivi\\.tests\\.device")))
      << output;
  EXPECT_EQ(printed(output, "PREFIX"), otherGroup.substr(0, 10));
  EXPECT_NE(printed(output, "PREFIX"), team);
  EXPECT_EQ(printed(output, "EXIT"), "0") << output;
}

TEST_F(KivApplicationPrefixProviderTest, ProcessesAskingAtOnceShareOneMarkerAndPrefix) {
  constexpr int kChildren = 6;
  const std::string barrier = sharedKeyring().bus.directory() + "/barrier";
  std::filesystem::remove_all(barrier);
  std::filesystem::create_directories(barrier);
  std::vector<std::pair<pid_t, std::string>> children;
  for (int i = 0; i < kChildren; ++i) {
    const std::string output = outputFile();
    children.emplace_back(
        startChild({std::string(kChildBarrier) + "=" + barrier}, "/proc/self/exe", output), output);
  }
  // Let them go together once all are ready.
  const auto deadline = std::chrono::steady_clock::now() + testing::kTimeout;
  auto ready = [&] {
    return std::distance(std::filesystem::directory_iterator(barrier),
                         std::filesystem::directory_iterator{});
  };
  while (ready() < kChildren && std::chrono::steady_clock::now() < deadline) {
    std::this_thread::sleep_for(std::chrono::milliseconds(2));
  }
  EXPECT_EQ(ready(), kChildren);
  std::ofstream(barrier + "/go") << "go";

  const std::string expected = SecDefaultAccessGroup().substr(0, 10);
  for (const auto& [pid, output] : children) {
    const std::string text = waitChild(pid, output);
    EXPECT_EQ(printed(text, "PREFIX"), expected) << text;
    EXPECT_EQ(printed(text, "ERROR"), "<null>") << text;
    EXPECT_EQ(printed(text, "EXIT"), "0") << text;
  }
  EXPECT_EQ(markers(), 1u);
}

TEST_F(KivApplicationPrefixProviderTest, WithoutAKeyringAnswersNullAndTheStatusAsError) {
  const std::string output = runChild(
      {"DBUS_SESSION_BUS_ADDRESS=unix:path=" + sharedKeyring().bus.directory() + "/no-socket"});
  EXPECT_EQ(printed(output, "PREFIX"), "<null>") << output;
  EXPECT_EQ(printed(output, "ERROR"), "NSOSStatusErrorDomain -25291 0") << output;
  EXPECT_EQ(printed(output, "EXIT"), "0") << output;
}

// Not a test of its own: what a child process does, by KIVI_PREFIX_CHILD.
TEST(PrefixProviderChild, Run) {
  if (!std::getenv(kChildMode)) return;
  if (const char* barrier = std::getenv(kChildBarrier)) {
    std::ofstream(std::string(barrier) + "/ready-" + std::to_string(::getpid())) << "";
    const auto deadline = std::chrono::steady_clock::now() + testing::kTimeout;
    while (!std::filesystem::exists(std::string(barrier) + "/go") &&
           std::chrono::steady_clock::now() < deadline) {
      std::this_thread::sleep_for(std::chrono::milliseconds(1));
    }
  }
  ErrorPtr error = Error::create("stale", 1);
  const auto prefix = KivApplicationPrefixProvider::applicationIdentifierPrefixWithError(&error);
  std::cout << "GROUP=" << SecDefaultAccessGroup() << "\n"
            << "PREFIX=" << prefix.value_or("<null>") << "\n"
            << "ERROR="
            << (error ? error->domain() + " " + std::to_string(error->code()) + " " +
                            std::to_string(error->userInfo().size())
                      : "<null>")
            << std::endl;
}

}  // namespace
}  // namespace kivi

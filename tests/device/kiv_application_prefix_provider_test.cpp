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

#include "keyring_session.h"
#include "kivi/security/keychain.h"
#include "test_support.h"

namespace kivi {
namespace {

constexpr const char* kChildMode = "KIVI_PREFIX_CHILD";
constexpr const char* kChildBarrier = "KIVI_PREFIX_BARRIER";  // a directory

using testing::printed;
using testing::sharedKeyring;

// Waits for the child; answers its stdout followed by "EXIT=<exit code, -1
// when killed>".
std::string waitChild(pid_t pid, const std::string& outputFile) {
  if (pid <= 0) return "<not started>";
  const testing::ChildResult r = testing::waitForChild(pid, outputFile);
  return r.output + "\nEXIT=" + std::to_string(r.exitCode) + "\n";
}

const Dictionary kMarker{{kSecClass, kSecClassGenericPassword},
                         {kSecAttrAccount, "appIdentifierPrefix"},
                         {kSecAttrService, ""}};

class KivApplicationPrefixProviderTest : public ::testing::Test {
 protected:
  void SetUp() override {
    if (const std::string reason = testing::keyringSkipReason(); !reason.empty()) {
      GTEST_SKIP() << reason;
    }
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
    return testing::spawnChild({binary, "--gtest_filter=PrefixProviderChild.Run"}, environment,
                               output);
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

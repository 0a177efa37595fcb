// The keychain against a real gnome-keyring-daemon on a private session bus.
// One bus and one daemon serve the whole binary; tests keep apart by service
// name. Children re-run this binary with KIVI_KEYCHAIN_CHILD set, which makes
// KeychainChild.Run do one thing and print its answer.
#include "kivi/security/keychain.h"

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>

#include <algorithm>
#include <atomic>
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
#include "test_support.h"

namespace kivi {
namespace {

constexpr const char* kChildMode = "KIVI_KEYCHAIN_CHILD";

using testing::ChildResult;
using testing::Keyring;
using testing::printed;
using testing::runChild;
using testing::sharedKeyring;

class KeychainTest : public ::testing::Test {
 protected:
  void SetUp() override {
    if (const std::string reason = testing::keyringSkipReason(); !reason.empty())
      GTEST_SKIP() << reason;
    ASSERT_EQ(sharedKeyring().failure, "");
  }

  // Runs this binary's KeychainChild.Run in `mode`.
  static ChildResult child(const std::string& mode, std::vector<std::string> environment = {},
                           const std::string& binary = "/proc/self/exe") {
    static std::atomic<int> count{0};
    environment.push_back(std::string(kChildMode) + "=" + mode);
    ChildResult result =
        runChild({binary, "--gtest_filter=KeychainChild.Run"}, environment,
                 sharedKeyring().bus.directory() + "/child" + std::to_string(++count) + ".out");
    EXPECT_EQ(result.exitCode, 0) << result.output;
    return result;
  }

  static Dictionary item(const std::string& service, const std::string& account) {
    return {{kSecClass, kSecClassGenericPassword},
            {kSecAttrService, service},
            {kSecAttrAccount, account}};
  }
  static Dictionary with(Dictionary d, const char* key, Value value) {
    d[key] = std::move(value);
    return d;
  }
};

TEST_F(KeychainTest, AddedItemsAreFoundWithTheirAttributesAndData) {
  const Data secret{0, 1, 2, 255, 'x'};
  Value added;
  ASSERT_EQ(SecItemAdd(with(with(item("found", "alice"), kSecValueData, secret),
                            kSecReturnAttributes, true),
                       &added),
            errSecSuccess);
  const Dictionary expected{
      {kSecClass, "genp"},        {kSecAttrAccount, "alice"},
      {kSecAttrService, "found"}, {kSecAttrAccessGroup, SecDefaultAccessGroup()},
      {kSecAttrAccessible, "ak"}, {kSecAttrLabel, "found"}};
  EXPECT_EQ(added, Value(expected));

  Value found;
  ASSERT_EQ(SecItemCopyMatching(with(item("found", "alice"), kSecReturnAttributes, true), &found),
            errSecSuccess);
  EXPECT_EQ(found, Value(expected));
  ASSERT_EQ(SecItemCopyMatching(with(item("found", "alice"), kSecReturnData, true), &found),
            errSecSuccess);
  EXPECT_EQ(found, Value(secret));
  ASSERT_EQ(SecItemCopyMatching(with(with(item("found", "alice"), kSecReturnData, true),
                                     kSecReturnAttributes, true),
                                &found),
            errSecSuccess);
  ASSERT_NE(found.asDictionary(), nullptr);
  EXPECT_EQ(*found.find(kSecValueData), Value(secret));
  EXPECT_EQ(*found.find(kSecAttrAccount), Value("alice"));

  // A second item: given label, accessibility and group, no data; both by
  // service with m_LimitAll, and each by its own attributes.
  ASSERT_EQ(SecItemAdd(with(with(with(item("found", "bob"), kSecAttrLabel, "Bob's"),
                                 kSecAttrAccessible, kSecAttrAccessibleAfterFirstUnlock),
                            kSecAttrAccessGroup, "OTHER.group"),
                       nullptr),
            errSecSuccess);
  Dictionary byService{{kSecClass, kSecClassGenericPassword},
                       {kSecAttrService, "found"},
                       {kSecReturnAttributes, true},
                       {kSecMatchLimit, kSecMatchLimitAll}};
  ASSERT_EQ(SecItemCopyMatching(byService, &found), errSecSuccess);
  ASSERT_NE(found.asArray(), nullptr);
  EXPECT_EQ(found.asArray()->size(), 1u) << "the other group's item is not in the default group";
  ASSERT_EQ(SecItemCopyMatching(with(byService, kSecAttrAccessGroup, "OTHER.group"), &found),
            errSecSuccess);
  ASSERT_EQ(found.asArray()->size(), 1u);
  const Value& bob = found.asArray()->front();
  EXPECT_EQ(*bob.find(kSecAttrLabel), Value("Bob's"));
  EXPECT_EQ(*bob.find(kSecAttrAccessible), Value("ck"));
  ASSERT_EQ(SecItemCopyMatching(with(with(item("found", "bob"), kSecAttrAccessGroup, "OTHER.group"),
                                     kSecReturnData, true),
                                &found),
            errSecSuccess);
  EXPECT_EQ(found, Value(Data{}));
  EXPECT_EQ(SecItemCopyMatching(with(with(item("found", "bob"), kSecAttrAccessGroup, "OTHER.group"),
                                     kSecAttrLabel, "someone else's"),
                                nullptr),
            errSecItemNotFound);

  // The items are the keyring's own, under the keychain's schema.
  const ChildResult search = sharedKeyring().call(
      "SearchItems", "{'xdg:schema': 'org.kiviossdk.Keychain', 'svce': 'found'}");
  EXPECT_TRUE(std::regex_match(
      search.output,
      std::regex(
          "\\(\\[objectpath '[^']+/login/[0-9]+', '[^']+/login/[0-9]+'\\], @ao \\[\\]\\)\\s*")))
      << search.output;
}

TEST_F(KeychainTest, StatusesOfDuplicatesMissingItemsAndBadQueries) {
  ASSERT_EQ(SecItemAdd(with(item("dup", "a"), kSecValueData, Data{1}), nullptr), errSecSuccess);
  // Same class, account, service and group: a duplicate whatever else differs.
  EXPECT_EQ(SecItemAdd(with(with(item("dup", "a"), kSecValueData, Data{2}), kSecAttrAccessible,
                            kSecAttrAccessibleAfterFirstUnlock),
                       nullptr),
            errSecDuplicateItem);
  EXPECT_EQ(
      SecItemAdd(with(item("dup", "a"), kSecAttrAccessGroup, SecDefaultAccessGroup()), nullptr),
      errSecDuplicateItem);
  EXPECT_EQ(SecItemAdd(with(item("dup", "a"), kSecAttrAccessGroup, "X.y"), nullptr), errSecSuccess);

  Value untouched("untouched");
  EXPECT_EQ(SecItemCopyMatching(item("dup", "nobody"), &untouched), errSecItemNotFound);
  EXPECT_EQ(untouched, Value("untouched"));

  EXPECT_EQ(SecItemAdd({{kSecAttrService, "dup"}}, nullptr), errSecParam);
  EXPECT_EQ(SecItemDelete(with(item("dup", "a"), kSecClass, "inet")), errSecUnimplemented);
  EXPECT_EQ(SecItemAdd(with(item("dup", "b"), kSecValueData, "not data"), nullptr), errSecParam);
  EXPECT_EQ(SecItemCopyMatching(with(item("dup", "a"), kSecAttrAccount, 7), nullptr), errSecParam);
  // D-Bus strings are UTF-8 without NUL bytes.
  EXPECT_EQ(SecItemAdd(item("dup", std::string("a\0b", 3)), nullptr), errSecParam);
  EXPECT_EQ(SecItemCopyMatching(item("dup\xff", "a"), nullptr), errSecParam);
  EXPECT_EQ(SecItemCopyMatching(with(item("dup", "a"), kSecMatchLimit, "m_LimitSome"), nullptr),
            errSecParam);

  // Delete removes what matches, in the default group only unless told.
  EXPECT_EQ(SecItemDelete(item("dup", "a")), errSecSuccess);
  EXPECT_EQ(SecItemCopyMatching(item("dup", "a"), nullptr), errSecItemNotFound);
  EXPECT_EQ(SecItemDelete(item("dup", "a")), errSecItemNotFound);
  EXPECT_EQ(SecItemCopyMatching(with(item("dup", "a"), kSecAttrAccessGroup, "X.y"), nullptr),
            errSecSuccess);
}

TEST_F(KeychainTest, ThreadsAddingOneItemAtOnceStoreItOnce) {
  constexpr int kThreads = 6;
  std::atomic<int> added{0}, duplicates{0}, other{0};
  std::vector<std::thread> threads;
  for (int i = 0; i < kThreads; ++i) {
    threads.emplace_back([&] {
      const OSStatus s = SecItemAdd(item("race", "one"), nullptr);
      (s == errSecSuccess ? added : s == errSecDuplicateItem ? duplicates : other)++;
    });
  }
  for (auto& t : threads) t.join();
  EXPECT_EQ(added, 1);
  EXPECT_EQ(duplicates, kThreads - 1);
  EXPECT_EQ(other, 0);
}

TEST_F(KeychainTest, DefaultGroupIsStablePerExecutablePath) {
  const std::string group = SecDefaultAccessGroup();
  EXPECT_TRUE(std::regex_match(group, std::regex("[0-9A-F]{10}\\.kivi_tests_security"))) << group;

  const ChildResult same = child("group");
  EXPECT_EQ(printed(same.output, "GROUP"), group) << same.output;

  // The same program at another place is another application.
  const std::string copyDir = sharedKeyring().bus.directory() + "/copy";
  std::filesystem::create_directories(copyDir);
  const std::string copy = copyDir + "/kivi_tests_security";
  std::filesystem::copy_file("/proc/self/exe", copy,
                             std::filesystem::copy_options::overwrite_existing);
  std::filesystem::permissions(copy, std::filesystem::perms::owner_all);
  const ChildResult moved = child("group", {}, copy);
  const std::string other = printed(moved.output, "GROUP");
  EXPECT_TRUE(std::regex_match(other, std::regex("[0-9A-F]{10}\\.kivi_tests_security"))) << other;
  EXPECT_NE(other, group);
  std::filesystem::remove(copy);
}

TEST_F(KeychainTest, WithoutAKeyringEveryCallAnswersNotAvailableAtOnce) {
  testing::PrivateBus emptyBus;  // a session bus nobody keeps secrets on
  ASSERT_TRUE(emptyBus.started());
  for (const std::string& address :
       {emptyBus.address(), "unix:path=" + emptyBus.directory() + "/no-such-socket"}) {
    const ChildResult r = child("unavailable", {"DBUS_SESSION_BUS_ADDRESS=" + address});
    EXPECT_EQ(printed(r.output, "COPY"), "-25291") << address << "\n" << r.output;
    EXPECT_EQ(printed(r.output, "ADD"), "-25291") << address;
    EXPECT_EQ(printed(r.output, "DELETE"), "-25291") << address;
    EXPECT_EQ(printed(r.output, "ADD_ANOTHER"), "-25291") << address;
    // At once, not after a D-Bus timeout (25 s).
    EXPECT_LT(std::stoi("0" + printed(r.output, "MILLISECONDS")), 10000) << r.output;
  }
}

TEST_F(KeychainTest, ABusThatNeverAnswersIsNotAvailableAfterABoundedWait) {
  // Accepts the connection and never says a word.
  const std::string name = "kivi-silent-keyring-" + std::to_string(::getpid());
  sockaddr_un address{AF_UNIX, {}};
  name.copy(address.sun_path + 1, sizeof address.sun_path - 2);
  const int listener = ::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
  ASSERT_EQ(::bind(listener, reinterpret_cast<sockaddr*>(&address),
                   offsetof(sockaddr_un, sun_path) + 1 + name.size()),
            0);
  ASSERT_EQ(::listen(listener, 4), 0);
  const ChildResult r = child("silent", {"DBUS_SESSION_BUS_ADDRESS=unix:abstract=" + name});
  ::close(listener);
  EXPECT_EQ(printed(r.output, "COPY"), "-25291") << r.output;
  EXPECT_LT(std::stoi("0" + printed(r.output, "MILLISECONDS")), 15000) << r.output;
}

TEST_F(KeychainTest, ALockedKeyringIsNotAvailableAndNeverPrompts) {
  Keyring other;  // a keyring of its own, to lock
  ASSERT_EQ(other.failure, "");
  ASSERT_EQ(printed(child("add", other.environment()).output, "ADD"), "0");
  const ChildResult lock =
      other.call("Lock", "[objectpath '/org/freedesktop/secrets/collection/login']");
  ASSERT_EQ(lock.exitCode, 0) << lock.output;

  const ChildResult r = child("unavailable", other.environment());
  EXPECT_EQ(printed(r.output, "COPY"), "-25291") << r.output;
  EXPECT_EQ(printed(r.output, "ADD"), "-25291");
  EXPECT_EQ(printed(r.output, "DELETE"), "-25291");
  EXPECT_EQ(printed(r.output, "ADD_ANOTHER"), "-25291") << "storing would need an unlock prompt";
  EXPECT_LT(std::stoi("0" + printed(r.output, "MILLISECONDS")), 10000) << r.output;
}

// Not a test of its own: what a child process does, by KIVI_KEYCHAIN_CHILD.
TEST(KeychainChild, Run) {
  const char* mode = std::getenv(kChildMode);
  if (!mode) return;
  const Dictionary query{{kSecClass, kSecClassGenericPassword},
                         {kSecAttrService, "child"},
                         {kSecAttrAccount, "c"},
                         {kSecReturnData, true}};
  const std::string m = mode;
  if (m == "group") std::cout << "GROUP=" << SecDefaultAccessGroup() << std::endl;
  if (m == "add") std::cout << "ADD=" << SecItemAdd(query, nullptr) << std::endl;
  if (m == "unavailable" || m == "silent") {
    const auto start = std::chrono::steady_clock::now();
    Value result;
    std::cout << "COPY=" << SecItemCopyMatching(query, &result) << std::endl;
    if (m == "unavailable") {
      std::cout << "ADD=" << SecItemAdd(query, &result) << std::endl;
      std::cout << "DELETE=" << SecItemDelete(query) << std::endl;
      Dictionary another = query;
      another[kSecAttrAccount] = Value("another");
      std::cout << "ADD_ANOTHER=" << SecItemAdd(another, nullptr) << std::endl;
    }
    std::cout << "MILLISECONDS="
              << std::chrono::duration_cast<std::chrono::milliseconds>(
                     std::chrono::steady_clock::now() - start)
                     .count()
              << std::endl;
  }
}

}  // namespace
}  // namespace kivi

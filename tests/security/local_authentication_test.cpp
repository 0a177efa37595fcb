// LAContext against a scripted fingerprint service on a private bus, and
// against buses that are missing or never answer.
#include "kivi/security/local_authentication.h"

#include <gtest/gtest.h>
#include <pwd.h>
#include <sys/socket.h>
#include <sys/un.h>

#include "private_bus.h"
#include "test_support.h"

namespace kivi {
namespace {

constexpr LAPolicy kBiometrics = LAPolicyDeviceOwnerAuthenticationWithBiometrics;

void expectError(const ErrorPtr& error, LAError code, const std::string& description) {
  ASSERT_NE(error, nullptr);
  EXPECT_EQ(error->domain(), LAErrorDomain);
  EXPECT_EQ(error->code(), code);
  EXPECT_EQ(error->localizedDescription(), description);
}

class LAContextTest : public ::testing::Test {
 protected:
  void SetUp() override {
    if (!testing::PrivateBus::available()) GTEST_SKIP() << "dbus-daemon is not installed";
    if (!std::filesystem::exists("/usr/lib/python3/dist-packages/dbusmock")) {
      GTEST_SKIP() << "python3-dbusmock is not installed";
    }
    ASSERT_TRUE(bus_.started());
    LASetSystemBusAddressForTesting(bus_.address());
  }
  void TearDown() override { LASetSystemBusAddressForTesting(""); }

  // Starts the service with `readers` (JSON: per reader, the fingers `user`
  // enrolled; the current user when empty) and waits for it on the bus.
  void startService(const std::string& readers, std::string user = {}) {
    if (user.empty()) user = ::getpwuid(::geteuid())->pw_name;
    const auto script = std::filesystem::path(__FILE__).parent_path() / "fprint_mock.py";
    ASSERT_GT(bus_.spawn({"/usr/bin/python3", "-m", "dbusmock", "-t", script, "-l",
                          bus_.directory() + "/mock.log", "-p",
                          R"({"user": ")" + user + R"(", "readers": )" + readers + "}"}),
              0);
    ASSERT_EQ(testing::runChild({"/usr/bin/gdbus", "wait", "--address", bus_.address(), "--timeout",
                                 "10", "net.reactivated.Fprint"})
                  .exitCode,
              0);
  }

  testing::PrivateBus bus_;
  std::shared_ptr<LAContext> context_ = std::make_shared<LAContext>();
  ErrorPtr error_ = Error::create("stale", 1);
};

TEST_F(LAContextTest, AnEnrolledFingerOnAnyReaderPasses) {
  ASSERT_NO_FATAL_FAILURE(startService(R"([[], ["right-index-finger"]])"));
  EXPECT_EQ(context_->biometryType(), LABiometryTypeNone);
  EXPECT_TRUE(context_->canEvaluatePolicy(kBiometrics, &error_));
  EXPECT_EQ(error_, nullptr);
  EXPECT_EQ(context_->biometryType(), LABiometryTypeTouchID);

  std::atomic<int> passed{0};
  std::vector<std::thread> threads;
  for (int i = 0; i < 4; ++i) {
    threads.emplace_back([&] {
      for (int j = 0; j < 3; ++j) passed += context_->canEvaluatePolicy(kBiometrics, nullptr);
    });
  }
  for (auto& thread : threads) thread.join();
  EXPECT_EQ(passed, 12);
}

TEST_F(LAContextTest, OnlySomebodyElsesFingersIsNotEnrolledButThePasswordRemains) {
  ASSERT_NO_FATAL_FAILURE(startService(R"([["left-thumb"]])", "somebody-else"));
  EXPECT_FALSE(context_->canEvaluatePolicy(kBiometrics, &error_));
  expectError(error_, LAErrorBiometryNotEnrolled, "No fingerprint is enrolled.");
  EXPECT_EQ(context_->biometryType(), LABiometryTypeTouchID);
  EXPECT_TRUE(context_->canEvaluatePolicy(LAPolicyDeviceOwnerAuthentication, &error_));
  EXPECT_EQ(error_, nullptr);
}

TEST_F(LAContextTest, NoServiceOrNoReaderIsNotAvailable) {
  EXPECT_FALSE(context_->canEvaluatePolicy(kBiometrics, &error_));
  ASSERT_NO_FATAL_FAILURE(
      expectError(error_, LAErrorBiometryNotAvailable, "The fingerprint service is not running."));
  EXPECT_NE(error_->userInfo().at(DebugDescriptionErrorKey).description().find("ServiceUnknown"),
            std::string::npos);
  EXPECT_TRUE(context_->canEvaluatePolicy(LAPolicyDeviceOwnerAuthentication, &error_));

  ASSERT_NO_FATAL_FAILURE(startService("[]"));
  EXPECT_FALSE(context_->canEvaluatePolicy(kBiometrics, &error_));
  expectError(error_, LAErrorBiometryNotAvailable, "No fingerprint reader is available.");
  EXPECT_EQ(context_->biometryType(), LABiometryTypeNone);
}

TEST(LAContext, MissingOrSilentBusIsNotAvailableWithinTheProbeTime) {
  auto context = std::make_shared<LAContext>();
  ErrorPtr error;
  LASetSystemBusAddressForTesting("unix:path=/nonexistent/kivi/bus");
  EXPECT_FALSE(context->canEvaluatePolicy(kBiometrics, &error));
  expectError(error, LAErrorBiometryNotAvailable, "The system bus cannot be reached.");

  // A socket that takes the connection and never says a word.
  const std::string name = "kivi-silent-" + std::to_string(::getpid());
  sockaddr_un address{AF_UNIX, {}};
  name.copy(address.sun_path + 1, sizeof address.sun_path - 2);
  const int listener = ::socket(AF_UNIX, SOCK_STREAM, 0);
  ASSERT_EQ(::bind(listener, reinterpret_cast<sockaddr*>(&address),
                   offsetof(sockaddr_un, sun_path) + 1 + name.size()),
            0);
  ASSERT_EQ(::listen(listener, 4), 0);
  LASetSystemBusAddressForTesting("unix:abstract=" + name);
  EXPECT_TRUE(testing::returnsWithin([&] { context->canEvaluatePolicy(kBiometrics, &error); }));
  expectError(error, LAErrorBiometryNotAvailable,
              "The fingerprint service did not answer in time.");
  LASetSystemBusAddressForTesting("");
  ::close(listener);
}

TEST(LAContext, UnknownPolicyIsAnInvalidContext) {
  auto context = std::make_shared<LAContext>();
  ErrorPtr error;
  EXPECT_FALSE(context->canEvaluatePolicy(static_cast<LAPolicy>(3), &error));
  expectError(error, LAErrorInvalidContext, "Unknown policy.");
  EXPECT_FALSE(context->canEvaluatePolicy(static_cast<LAPolicy>(-1), nullptr));
}

}  // namespace
}  // namespace kivi

#include "kivi/device/kiv_device.h"

#include <gtest/gtest.h>

#include <cstdint>
#include <cstdlib>
#include <string>

#include "fake_root.h"
#include "kivi/device/kiv_device_attributes.h"
#include "kivi/doubles/mock_kiv_device_attributes.h"
#include "kivi/security/local_authentication.h"
#include "kivi/system/sysctl.h"

namespace kivi {
namespace {

TEST(KivDevice, ModelNamesComeFromTheTableOrTheIdentifierItself) {
  EXPECT_EQ(KivDevice::deviceNameMappingDictionary().size(), 57u);
  struct Case {
    const char* arch;  // nullptr: the machine identifier cannot be read
    const char* platformName;
    const char* hardwareModel;
  };
  const Case cases[] = {
      {"iPhone3,3\n", "iPhone 4 CDMA", "iPhone4"},
      {"iPad4,4\n", "iPad Mini 2 Retina WiFi", "iPad4,4"},
      {"x86_64\n", "Simulator x86_64", "Simulator"},
      {"iPod1,1\n", "iPod 1G", "iPod 1G"},
      {"iPhone10,3\n", "iPhone10,3", "iPhone10,3"},
      {"aarch64\n", "aarch64", "aarch64"},
      {nullptr, "UnDetermined", "UnDetermined"},
      {"\xff\xfe\n", "UnDetermined", "UnDetermined"},  // not UTF-8
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.arch ? c.arch : "(unreadable)");
    testing::FakeRoot root;
    if (c.arch) root.write("/proc/sys/kernel/arch", c.arch);
    EXPECT_EQ(KivDevice::platformName(), c.platformName);
    EXPECT_EQ(KivDevice::hardwareModel(), c.hardwareModel);
  }
}

TEST(KivDevice, SystemInformationByNameAnswersTextOrNull) {
  testing::FakeRoot root;
  root.write("/proc/sys/kernel/arch", "iPad6,7\n");
  EXPECT_EQ(KivDevice::getSystemInformationByName("hw.machine"), "iPad6,7");
  EXPECT_EQ(KivDevice::getSystemInformationByName(nullptr), std::nullopt);
  EXPECT_EQ(KivDevice::getSystemInformationByName("hw.nothing"), std::nullopt);
  EXPECT_EQ(KivDevice::getSystemInformationByName("\xff\xfe"), std::nullopt);
  EXPECT_EQ(KivDevice::getSystemInformationByName(std::string(10240, 'h').c_str()), std::nullopt);
}

// The model tests are worked out once per process: each case runs in a child.
TEST(KivDeviceDeathTest, ModelTestsAreWorkedOutOnceAndKept) {
  GTEST_FLAG_SET(death_test_style, "threadsafe");
  EXPECT_EXIT(
      {
        testing::FakeRoot root;
        root.write("/proc/sys/kernel/arch", "iPad6,8\n");
        const bool first = KivDevice::isDeviceiPadPro() && !KivDevice::isDeviceiPhoneX();
        root.write("/proc/sys/kernel/arch", "iPhone10,6\n");
        // The iPad answer stays; the iPhone test had been answered too.
        const bool kept = KivDevice::isDeviceiPadPro() && !KivDevice::isDeviceiPhoneX();
        std::exit(first && kept ? 0 : 1);
      },
      ::testing::ExitedWithCode(0), "");
  EXPECT_EXIT(
      {
        testing::FakeRoot root;  // no machine identifier
        const bool first = !KivDevice::isDeviceiPadPro() && !KivDevice::isDeviceiPhoneX();
        root.write("/proc/sys/kernel/arch", "iPhone10,3\n");
        std::exit(first && !KivDevice::isDeviceiPhoneX() ? 0 : 1);
      },
      ::testing::ExitedWithCode(0), "");
  EXPECT_EXIT(
      {
        testing::FakeRoot root;
        root.write("/proc/sys/kernel/arch", "iPad6,3\n");
        std::exit(!KivDevice::isDeviceiPadPro() ? 0 : 1);
      },
      ::testing::ExitedWithCode(0), "");
}

// A context with scripted answers.
class ScriptedContext : public LAContext {
 public:
  ScriptedContext(bool can, LABiometryType type, ErrorPtr error)
      : can_(can), type_(type), error_(std::move(error)) {}
  bool canEvaluatePolicy(LAPolicy policy, ErrorPtr* error) override {
    policy_ = policy;
    if (error) *error = error_;
    return can_;
  }
  LABiometryType biometryType() const override { return type_; }
  LAPolicy policy_ = LAPolicyDeviceOwnerAuthentication;

 private:
  bool can_;
  LABiometryType type_;
  ErrorPtr error_;
};

TEST(KivDevice, BiometricCapabilityMatchesTheKindAskedForWithTheContextsError) {
  struct Case {
    bool can;
    LABiometryType type;
    bool touchID;
    bool faceID;
  };
  const Case cases[] = {
      {true, LABiometryTypeTouchID, true, false},
      {true, LABiometryTypeFaceID, false, true},
      {true, LABiometryTypeNone, false, false},
      {true, static_cast<LABiometryType>(7), false, false},
      {false, LABiometryTypeTouchID, false, false},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(::testing::Message() << "can " << c.can << " type " << c.type);
    const auto reported =
        c.can ? nullptr : Error::create(LAErrorDomain, LAErrorBiometryNotEnrolled, {});
    auto context = std::make_shared<ScriptedContext>(c.can, c.type, reported);
    ErrorPtr error = Error::create("stale", 1, {});
    EXPECT_EQ(
        KivDevice::isCapableOfBiometricAuthForContext(context, KivBiometricAuthTypeTouchID, &error),
        c.touchID);
    EXPECT_EQ(error, reported);  // written on every call, null when none was reported
    EXPECT_EQ(context->policy_, LAPolicyDeviceOwnerAuthenticationWithBiometrics);
    EXPECT_EQ(
        KivDevice::isCapableOfBiometricAuthForContext(context, KivBiometricAuthTypeFaceID, nullptr),
        c.faceID);
  }
}

TEST(KivDevice, MemoryFiguresFollowTheKernelsAnswersAndFailInBand) {
  testing::FakeRoot root;
  // 8 GiB of memory: the 32-bit selectors answer their largest value.
  root.write("/proc/meminfo",
             "MemTotal:        8388608 kB\nMemFree:         1048576 kB\n"
             "MemAvailable:    4194304 kB\nActive:          2097152 kB\n"
             "Inactive:        1048576 kB\nUnevictable:       1024 kB\n"
             "KernelStack:       16384 kB\nPageTables:        32768 kB\n"
             "SUnreclaim:       65536 kB\n");
  root.write("/proc/vmstat", "pgpgin 100\npgpgout 200\npgfault 300\n");
  EXPECT_EQ(KivDevice::getSystemInformationForSpecifier(HW_PHYSMEM), 2147483647u);
  EXPECT_EQ(KivDevice::totalMemory(), 2047u);
  EXPECT_EQ(KivDevice::userMemory(), 2047u);
  EXPECT_EQ(KivDevice::physicalMemory(), std::int64_t{8} << 30);
  EXPECT_EQ(KivDevice::freeMemory(), 1024u);
  EXPECT_EQ(KivDevice::processFreeMemory(), std::int64_t{1} << 30);
  // A 64-bit value does not fit the 32-bit read; unknown selectors fail.
  EXPECT_EQ(KivDevice::getSystemInformationForSpecifier(HW_MEMSIZE), kKivDeviceUnknown);
  EXPECT_EQ(KivDevice::getSystemInformationForSpecifier(-1), kKivDeviceUnknown);
  EXPECT_EQ(KivDevice::getSystemInformationForSpecifier(9999), kKivDeviceUnknown);

  root.write("/proc/meminfo", "MemTotal:        1048576 kB\nMemFree: 12 kB\n");
  EXPECT_EQ(KivDevice::totalMemory(), 1024u);

  // Unreadable: the all-ones value passes through unshifted.
  root.remove("/proc/meminfo");
  EXPECT_EQ(KivDevice::totalMemory(), kKivDeviceUnknown);
  EXPECT_EQ(KivDevice::userMemory(), kKivDeviceUnknown);
  EXPECT_EQ(KivDevice::freeMemory(), kKivDeviceUnknown);
  EXPECT_EQ(KivDevice::processFreeMemory(), -1);
  // Nothing of this process under the fake root either.
  EXPECT_EQ(KivDevice::processResidentSize(), -1);
  EXPECT_EQ(KivDevice::processPhysicalFootprint(), -1);
  EXPECT_EQ(KivDevice::applicationMemory(), kKivDeviceUnknown);
  EXPECT_EQ(KivDevice::percentCpuUsage(), -1);
}

TEST(KivDevice, CpuUsageTruncatesAfterEveryThreadSkipsIdleOnesAndFailsWhole) {
  testing::FakeRoot root;
  root.write("/proc/self/stat", testing::procStatLine({.state = 'R'}));
  // Each thread's decayed use, scaled to 1000 for a whole processor.
  auto thread = [&](int tid, int utilAvg, long policy) {
    const std::string dir = "/proc/self/task/" + std::to_string(tid);
    root.write(dir + "/stat", testing::procStatLine({.state = 'R', .policy = policy}));
    root.write(dir + "/sched", "se.avg.util_avg : " + std::to_string(utilAvg) + "\n");
  };
  thread(101, 6, 0);  // about 0.6 % each: neither adds a whole percent
  thread(102, 6, 0);
  EXPECT_EQ(KivDevice::percentCpuUsage(), 0);
  thread(103, 1024, 0);  // one whole processor
  thread(104, 1024, 5);  // idle-class: not counted
  EXPECT_EQ(KivDevice::percentCpuUsage(), 100);
  root.remove("/proc/self/task/102/stat");  // a thread that cannot be read spoils the whole
  EXPECT_EQ(KivDevice::percentCpuUsage(), -1);
}

TEST(KivDevice, FiguresOfThisProcessAreRealAtTheRealRoot) {
  const std::int64_t resident = KivDevice::processResidentSize();
  EXPECT_GT(resident, 1 << 20);
  // Two reads of a live figure: the same size, give or take a little growth.
  EXPECT_NEAR(static_cast<double>(KivDevice::applicationMemory()),
              static_cast<double>(resident >> 20), 4.0);
  EXPECT_GT(KivDevice::processPhysicalFootprint(), 0);
  EXPECT_GE(KivDevice::percentCpuUsage(), 0);
}

TEST(KivDeviceAttributes, SerialNumberIsTheFirmwaresTrimmedOrAbsent) {
  testing::FakeRoot root;
  root.write("/sys/class/dmi/id/product_serial", " C02XYZ \n");
  EXPECT_EQ(KivDeviceAttributes().getMacHardwareSerialNumber(), "C02XYZ");
  root.write("/sys/class/dmi/id/product_serial", "\xc2\xa0\tC02 XYZ\r\n");
  EXPECT_EQ(KivDeviceAttributes().getMacHardwareSerialNumber(), "C02 XYZ");
  root.remove("/sys/class/dmi");
  EXPECT_EQ(KivDeviceAttributes().getMacHardwareSerialNumber(), std::nullopt);

  auto mock = std::make_shared<MockKivDeviceAttributes>();
  std::shared_ptr<KivDeviceAttributesProtocol> device = mock;
  EXPECT_EQ(device->getMacHardwareSerialNumber(), std::nullopt);
  mock->getMacHardwareSerialNumberBlock = [] { return std::optional<std::string>("M0CK"); };
  EXPECT_EQ(device->getMacHardwareSerialNumber(), "M0CK");
}

}  // namespace
}  // namespace kivi

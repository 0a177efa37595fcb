#include "kivi/system/io_registry.h"

#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <string>

#include "fake_root.h"

namespace kivi {
namespace {

// Each test reads from a fresh fake root.
class IORegistryTest : public ::testing::Test {
 protected:
  testing::FakeRoot root;
};

io_service_t platformDevice() {
  return IOServiceGetMatchingService(kIOMainPortDefault,
                                     IOServiceMatching("IOPlatformExpertDevice"));
}

Value property(io_service_t device, const char* key) {
  return IORegistryEntryCreateCFProperty(device, key, nullptr, 0);
}

TEST_F(IORegistryTest, NoFirmwareDescriptionMatchesNothing) {
  EXPECT_EQ(platformDevice(), 0u);
  EXPECT_TRUE(IOServiceMatching(nullptr).empty());
}

TEST_F(IORegistryTest, DmiPropertiesKeepTheFirmwareText) {
  root.write("/sys/class/dmi/id/product_serial", "  SN-1234 \n");
  root.write("/sys/class/dmi/id/product_name", "Board 9\n");
  root.write("/sys/class/dmi/id/sys_vendor", "Maker\n");
  EXPECT_EQ(IOServiceGetMatchingService(kIOMainPortDefault, IOServiceMatching("IOUSBDevice")), 0u);
  const io_service_t device = platformDevice();
  const io_service_t second = platformDevice();
  ASSERT_NE(device, 0u);
  EXPECT_NE(second, device);
  EXPECT_EQ(property(device, "IOPlatformSerialNumber"), Value("  SN-1234 "));
  EXPECT_EQ(property(device, "model"), Value("Board 9"));
  EXPECT_EQ(property(device, "manufacturer"), Value("Maker"));
  EXPECT_TRUE(property(device, "nothing").isNull());
  EXPECT_EQ(IOObjectRelease(device), KERN_SUCCESS);
  EXPECT_EQ(IOObjectRelease(device), KERN_INVALID_ARGUMENT);
  EXPECT_TRUE(property(device, "model").isNull());  // a released handle
  EXPECT_EQ(IOObjectRelease(second), KERN_SUCCESS);
  EXPECT_EQ(IOObjectRelease(0), KERN_INVALID_ARGUMENT);
}

TEST_F(IORegistryTest, PlaceholdersAndBinaryFallBackToTheDeviceTree) {
  root.write("/sys/class/dmi/id/product_name", "");
  const io_service_t device = platformDevice();
  ASSERT_NE(device, 0u);
  for (const char* placeholder :
       {"To Be Filled By O.E.M.\n", "Not Specified\n", "System Serial Number\n", "default STRING\n",
        " 0 \n", "None\n", "   \n", "", "C02\xff\xfe\n"}) {
    root.write("/sys/class/dmi/id/product_serial", placeholder);
    EXPECT_TRUE(property(device, "IOPlatformSerialNumber").isNull()) << placeholder;
  }
  EXPECT_TRUE(property(device, "model").isNull());  // empty DMI, no device tree
  root.write("/proc/device-tree/serial-number", std::string("DT-42\0", 6));
  root.write("/proc/device-tree/model", std::string("Pi Board\0", 9));
  EXPECT_EQ(property(device, "IOPlatformSerialNumber"), Value("DT-42"));
  EXPECT_EQ(property(device, "model"), Value("Pi Board"));
  EXPECT_EQ(IOObjectRelease(device), KERN_SUCCESS);
}

TEST_F(IORegistryTest, DeviceTreeAloneDescribesTheMachine) {
  root.write("/sys/firmware/devicetree/base/serial-number", std::string("10000000abcd\0", 13));
  const io_service_t device = platformDevice();
  ASSERT_NE(device, 0u);
  EXPECT_EQ(property(device, "IOPlatformSerialNumber"), Value("10000000abcd"));
  EXPECT_TRUE(property(device, "manufacturer").isNull());
  EXPECT_EQ(IOObjectRelease(device), KERN_SUCCESS);
}

TEST_F(IORegistryTest, UnreadableSerialIsAbsent) {
  if (::geteuid() == 0) GTEST_SKIP() << "root reads files whatever their mode";
  root.write("/sys/class/dmi/id/product_serial", "SN-1\n");
  ASSERT_EQ(::chmod(root.path("/sys/class/dmi/id/product_serial").c_str(), 0), 0);
  const io_service_t device = platformDevice();
  ASSERT_NE(device, 0u);
  EXPECT_TRUE(property(device, "IOPlatformSerialNumber").isNull());
  EXPECT_EQ(IOObjectRelease(device), KERN_SUCCESS);
}

}  // namespace
}  // namespace kivi

#include "kivi/system/sysctl.h"

#include <gtest/gtest.h>
#include <sys/utsname.h>
#include <unistd.h>

#include <cerrno>
#include <cstdint>
#include <cstring>
#include <string>

#include "fake_root.h"
#include "kivi/system/process_info.h"

namespace kivi {
namespace {

// Each test reads from a fresh fake root.
class SysctlTest : public ::testing::Test {
 protected:
  testing::FakeRoot root;
};

std::string readString(const char* name) {
  char buffer[256] = {};
  std::size_t size = sizeof buffer;
  if (sysctlbyname(name, buffer, &size, nullptr, 0) != 0)
    return "<errno " + std::to_string(errno) + ">";
  EXPECT_EQ(size, std::strlen(buffer) + 1);
  return buffer;
}

template <class T>
int readNumber(const char* name, T& value) {
  std::size_t size = sizeof value;
  const int result = sysctlbyname(name, &value, &size, nullptr, 0);
  if (result == 0) {
    EXPECT_EQ(size, sizeof value);
  }
  return result;
}

// -1 with errno set to `expected`.
::testing::AssertionResult failsWith(int result, int expected) {
  if (result == -1 && errno == expected) return ::testing::AssertionSuccess();
  return ::testing::AssertionFailure() << "result " << result << ", errno " << errno;
}

TEST_F(SysctlTest, KernelStringsByNameAndNumber) {
  root.write("/proc/sys/kernel/ostype", "Linux\n");
  root.write("/proc/sys/kernel/osrelease", "6.1.0-test\n");
  root.write("/proc/sys/kernel/version", "#1 SMP PREEMPT_DYNAMIC\n");
  root.write("/proc/sys/kernel/hostname", "box\n");
  root.write("/proc/sys/kernel/arch", "riscv64\n");
  EXPECT_EQ(readString("kern.ostype"), "Linux");
  EXPECT_EQ(readString("kern.version"), "#1 SMP PREEMPT_DYNAMIC");
  EXPECT_EQ(readString("kern.hostname"), "box");
  EXPECT_EQ(readString("hw.machine"), "riscv64");  // the file, as the root is not "/"

  const int release[] = {CTL_KERN, KERN_OSRELEASE};
  std::size_t size = 0;
  ASSERT_EQ(sysctl(release, 2, nullptr, &size, nullptr, 0), 0);
  EXPECT_EQ(size, 11u);  // "6.1.0-test" and its NUL
  char text[32];
  size = sizeof text;
  ASSERT_EQ(sysctl(release, 2, text, &size, nullptr, 0), 0);
  EXPECT_STREQ(text, "6.1.0-test");

  // Too small: what fits is copied, the size needed is reported.
  char small[4] = {'x', 'x', 'x', 'x'};
  size = 3;
  EXPECT_TRUE(failsWith(sysctlbyname("kern.hostname", small, &size, nullptr, 0), ENOMEM));
  EXPECT_EQ(size, 4u);
  EXPECT_EQ(std::string(small, 4), "boxx");  // nothing written past the buffer
}

TEST_F(SysctlTest, Failures) {
  root.write("/proc/sys/kernel/hostname", "box\n");
  char buffer[16];
  std::size_t size = sizeof buffer;
  const char value[] = "other";
  EXPECT_TRUE(failsWith(sysctlbyname("kern.hostname", buffer, &size, value, sizeof value), EPERM));
  EXPECT_TRUE(failsWith(sysctlbyname("kern.nosuchthing", buffer, &size, nullptr, 0), ENOENT));
  EXPECT_TRUE(failsWith(sysctlbyname(nullptr, buffer, &size, nullptr, 0), EINVAL));
  EXPECT_TRUE(failsWith(sysctlbyname("kern.hostname", buffer, nullptr, nullptr, 0), EINVAL));
  const int name[13] = {CTL_KERN, KERN_HOSTNAME};
  EXPECT_TRUE(failsWith(sysctl(nullptr, 2, buffer, &size, nullptr, 0), EINVAL));
  EXPECT_TRUE(failsWith(sysctl(name, 0, buffer, &size, nullptr, 0), EINVAL));
  EXPECT_TRUE(failsWith(sysctl(name, 13, buffer, &size, nullptr, 0), EINVAL));
  EXPECT_TRUE(failsWith(sysctl(name, 3, buffer, &size, nullptr, 0), ENOENT));
  const int unknown[] = {CTL_HW, 999};
  EXPECT_TRUE(failsWith(sysctl(unknown, 2, buffer, &size, nullptr, 0), ENOENT));
  // A known name whose file is missing.
  EXPECT_TRUE(failsWith(sysctlbyname("kern.ostype", buffer, &size, nullptr, 0), EIO));
}

TEST_F(SysctlTest, MemoryClampsThe32BitNames) {
  root.write("/proc/meminfo",
             "MemTotal:       16777216 kB\nMemFree:         1000 kB\nKernelStack:  1024 kB\n"
             "PageTables:   1024 kB\nSUnreclaim:   2048 kB\nUnevictable:  0 kB\n");
  std::int64_t memsize = 0;
  ASSERT_EQ(readNumber("hw.memsize", memsize), 0);
  EXPECT_EQ(memsize, 16ll << 30);
  std::int32_t physmem = 0;
  ASSERT_EQ(readNumber("hw.physmem", physmem), 0);
  EXPECT_EQ(physmem, 2147483647);
  EXPECT_EQ(ProcessInfo::processInfo().physicalMemory(), 16ull << 30);

  root.write("/proc/meminfo",
             "MemTotal:       1048576 kB\nKernelStack:  1024 kB\nPageTables:   1024 kB\n"
             "SUnreclaim:   2048 kB\n");
  std::int32_t usermem = 0;
  const int name[] = {CTL_HW, HW_USERMEM};
  std::size_t size = 8;  // a larger buffer still gets 4 bytes
  std::int64_t wide = 0;
  ASSERT_EQ(sysctl(name, 2, &wide, &size, nullptr, 0), 0);
  EXPECT_EQ(size, 4u);
  std::memcpy(&usermem, &wide, 4);
  EXPECT_EQ(usermem, (1 << 30) - (4 << 20));

  // A 64-bit value does not fit 4 bytes.
  size = 4;
  EXPECT_TRUE(failsWith(sysctlbyname("hw.memsize", &usermem, &size, nullptr, 0), ENOMEM));
  EXPECT_EQ(size, 8u);
}

TEST_F(SysctlTest, UnreadableOrGarbledMemInfo) {
  std::int64_t memsize = 0;
  EXPECT_TRUE(failsWith(readNumber("hw.memsize", memsize), EIO));
  EXPECT_EQ(ProcessInfo::processInfo().physicalMemory(), 0u);
  for (const char* garbled : {"MemTotal: lots kB\n", "MemFree: 12 kB\n", "MemTotal: -5 kB\n",
                              "MemTotal: 99999999999999999999 kB\n"}) {
    root.write("/proc/meminfo", garbled);
    EXPECT_TRUE(failsWith(readNumber("hw.memsize", memsize), EIO)) << garbled;
  }
  root.write("/proc/meminfo", "MemTotal: 1024 kB\nSUnreclaim: ?? kB\n");
  std::int32_t usermem = 0;
  EXPECT_EQ(readNumber("hw.usermem", usermem), -1);
  EXPECT_EQ(readNumber("hw.physmem", usermem), 0);
}

TEST_F(SysctlTest, ProcessorLists) {
  root.write("/sys/devices/system/cpu/present", "0-3,5\n");
  root.write("/sys/devices/system/cpu/possible", "0-127\n");
  root.write("/sys/devices/system/cpu/online", "0,2\n");
  std::int32_t count = 0;
  ASSERT_EQ(readNumber("hw.ncpu", count), 0);
  EXPECT_EQ(count, 5);
  ASSERT_EQ(readNumber("hw.activecpu", count), 0);
  EXPECT_EQ(count, 2);
  EXPECT_EQ(ProcessInfo::processInfo().processorCount(), 5u);
  EXPECT_EQ(ProcessInfo::processInfo().activeProcessorCount(), 2u);
  for (const char* garbled : {"", "0-", "3-1", "a", "0,,1"}) {
    root.write("/sys/devices/system/cpu/online", garbled);
    EXPECT_TRUE(failsWith(readNumber("hw.logicalcpu", count), EIO)) << garbled;
  }
}

TEST(SysctlRealMachine, AnswersFromThisSystem) {
  struct utsname names {};
  ASSERT_EQ(::uname(&names), 0);
  EXPECT_EQ(readString("hw.machine"), names.machine);
  EXPECT_EQ(readString("kern.osrelease"), names.release);
  std::int32_t page = 0;
  ASSERT_EQ(readNumber("hw.pagesize", page), 0);
  EXPECT_EQ(page, ::sysconf(_SC_PAGESIZE));
  std::int64_t memsize = 0;
  ASSERT_EQ(readNumber("hw.memsize", memsize), 0);
  EXPECT_GT(memsize, 0);
  EXPECT_EQ(static_cast<std::uint64_t>(memsize), ProcessInfo::processInfo().physicalMemory());
  std::int32_t active = 0;
  ASSERT_EQ(readNumber("hw.activecpu", active), 0);
  EXPECT_EQ(active, ::sysconf(_SC_NPROCESSORS_ONLN));
  EXPECT_EQ(ProcessInfo::processInfo().processIdentifier(), ::getpid());
}

}  // namespace
}  // namespace kivi

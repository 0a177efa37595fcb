// Puts arbitrary bytes into one of the /proc, /sys and /etc files that the
// device facts are read from (the first byte picks the file) under a private
// root, then asks for every fact. Beyond not crashing or hanging:
//   - the signed byte figures are -1 or not negative;
//   - a figure the kernel interface calls failed is the failure value;
//   - the processor counts are absent or at least 1;
//   - text answers are valid UTF-8 or absent.
#include <unistd.h>

#include <cstddef>
#include <cstdint>
#include <filesystem>
#include <fstream>
#include <optional>
#include <string>
#include <string_view>

#include "fuzz_check.h"
#include "kivi/device/kiv_device.h"
#include "kivi/system/io_registry.h"
#include "kivi/system/locale_info.h"
#include "kivi/system/mach.h"
#include "kivi/system/sysctl.h"
#include "kivi/system/system_root.h"
#include "kivi/text/unicode_text.h"

using kivi::fuzz::check;

namespace {

// Plausible contents for every file; the fuzzer replaces one at a time.
struct File {
  const char* path;
  const char* baseline;
};
constexpr File kFiles[] = {
    {"/proc/meminfo",
     "MemTotal:        8000000 kB\nMemFree:  100 kB\nMemAvailable: 2000 kB\nKernelStack: 1 kB\n"},
    {"/proc/vmstat", "nr_free_pages 10\nnr_active_anon 5\nnr_inactive_anon 6\npgfault 7\n"},
    {"/proc/self/stat", "1 (x) S 0 0 0 0 0 0 0 0 0 0 5 6 0 0 0 0 1 0 10 4096 20\n"},
    {"/proc/self/status",
     "Name:\tx\nVmSize:\t 900 kB\nVmHWM:\t 200 kB\nVmRSS:\t 100 kB\nRssAnon:\t 50 kB\n"
     "VmSwap:\t 0 kB\nThreads:\t1\n"},
    {"/proc/self/task/1/stat", "1 (x) R 0 0 0 0 0 0 0 0 0 0 5 6 0 0 0 0 1 0 10 4096 20\n"},
    {"/proc/self/task/1/sched", "se.avg.util_avg : 512\n"},
    {"/proc/self/task/1/schedstat", "100 20 3\n"},
    {"/proc/uptime", "100.00 50.00\n"},
    {"/proc/sys/kernel/arch", "x86_64\n"},
    {"/proc/sys/kernel/ostype", "Linux\n"},
    {"/proc/sys/kernel/osrelease", "6.1.0\n"},
    {"/proc/sys/kernel/hostname", "box\n"},
    {"/sys/devices/system/cpu/present", "0-3\n"},
    {"/sys/devices/system/cpu/online", "0-1,3\n"},
    {"/sys/class/dmi/id/product_serial", "C02XYZ\n"},
    {"/proc/device-tree/serial-number", "abc\0"},
    {"/etc/timezone", "Europe/Paris\n"},
};
constexpr std::size_t kFileCount = sizeof kFiles / sizeof kFiles[0];

void write(const std::string& root, std::string_view path, std::string_view contents) {
  const std::filesystem::path file = root + std::string(path);
  std::filesystem::create_directories(file.parent_path());
  std::ofstream(file, std::ios::binary | std::ios::trunc) << contents;
}

const std::string& fakeRoot() {
  static const std::string root = [] {
    char pattern[] = "/tmp/kivi-fuzz-root-XXXXXX";
    std::string directory = ::mkdtemp(pattern) ? pattern : "/tmp/kivi-fuzz-root";
    for (const File& file : kFiles) write(directory, file.path, file.baseline);
    kivi::system::setRoot(directory);
    return directory;
  }();
  return root;
}

void checkText(const std::optional<std::string>& text, const char* what, std::string_view input) {
  check(!text || kivi::unicode::isValidUTF8(*text), what, input);
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  if (size == 0) return 0;
  const std::string& root = fakeRoot();
  const File& file = kFiles[data[0] % kFileCount];
  const std::string_view contents(reinterpret_cast<const char*>(data) + 1, size - 1);
  write(root, file.path, contents);

  using kivi::KivDevice;
  for (const std::int64_t figure :
       {KivDevice::processResidentSize(), KivDevice::processPhysicalFootprint(),
        KivDevice::physicalMemory(), KivDevice::percentCpuUsage(),
        KivDevice::processFreeMemory()}) {
    check(figure >= -1, "a signed figure is -1 or not negative", contents);
  }
  (void)KivDevice::totalMemory();
  (void)KivDevice::userMemory();
  (void)KivDevice::applicationMemory();
  (void)KivDevice::freeMemory();
  for (std::int32_t selector = 0; selector < 30; ++selector) {
    (void)KivDevice::getSystemInformationForSpecifier(selector);
  }

  kivi::task_basic_info_64_data_t basic{};
  kivi::mach_msg_type_number_t count = kivi::TASK_BASIC_INFO_64_COUNT;
  const auto basicResult = kivi::task_info(kivi::mach_task_self(), kivi::TASK_BASIC_INFO_64,
                                           reinterpret_cast<kivi::task_info_t>(&basic), &count);
  check(basicResult == kivi::KERN_SUCCESS || count == kivi::TASK_BASIC_INFO_64_COUNT,
        "a failed task_info leaves the count alone", contents);

  kivi::thread_act_array_t threads = nullptr;
  kivi::mach_msg_type_number_t threadCount = 0;
  if (kivi::task_threads(kivi::mach_task_self(), &threads, &threadCount) == kivi::KERN_SUCCESS) {
    for (kivi::mach_msg_type_number_t i = 0; i < threadCount; ++i) {
      kivi::thread_basic_info_data_t info{};
      kivi::mach_msg_type_number_t infoCount = kivi::THREAD_BASIC_INFO_COUNT;
      if (kivi::thread_info(threads[i], kivi::THREAD_BASIC_INFO,
                            reinterpret_cast<kivi::thread_info_t>(&info),
                            &infoCount) == kivi::KERN_SUCCESS) {
        check(info.cpu_usage >= 0 && info.cpu_usage <= kivi::TH_USAGE_SCALE,
              "a thread's use is within one processor", contents);
      }
    }
    kivi::vm_deallocate(kivi::mach_task_self(), reinterpret_cast<kivi::vm_address_t>(threads),
                        threadCount * sizeof(kivi::thread_act_t));
  }

  kivi::vm_statistics_data_t vm{};
  kivi::mach_msg_type_number_t vmCount = kivi::HOST_VM_INFO_COUNT;
  (void)kivi::host_statistics(kivi::mach_host_self(), kivi::HOST_VM_INFO,
                              reinterpret_cast<kivi::host_info_t>(&vm), &vmCount);

  for (const char* name : {"hw.ncpu", "hw.activecpu", "hw.logicalcpu"}) {
    int processors = 0;
    std::size_t length = sizeof processors;
    if (kivi::sysctlbyname(name, &processors, &length, nullptr, 0) == 0) {
      check(processors >= 1, "a processor count is at least 1", contents);
    }
  }
  for (const char* name : {"hw.machine", "kern.ostype", "kern.osrelease", "kern.hostname"}) {
    checkText(KivDevice::getSystemInformationByName(name), "kernel text is UTF-8 or null",
              contents);
  }

  const auto service = kivi::IOServiceGetMatchingService(
      kivi::kIOMainPortDefault, kivi::IOServiceMatching("IOPlatformExpertDevice"));
  if (service) {
    const kivi::Value serial =
        kivi::IORegistryEntryCreateCFProperty(service, "IOPlatformSerialNumber", nullptr, 0);
    if (const kivi::String* text = serial.asString()) {
      check(kivi::unicode::isValidUTF8(text->view()), "a serial is UTF-8", contents);
    }
    kivi::IOObjectRelease(service);
  }

  (void)kivi::TimeZone::localTimeZone()->name();

  write(root, file.path, file.baseline);
  return 0;
}

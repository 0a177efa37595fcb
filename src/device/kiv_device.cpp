#include "kivi/device/kiv_device.h"

#include <algorithm>
#include <cmath>
#include <cstdlib>
#include <limits>
#include <mutex>
#include <new>
#include <string_view>

#include "kivi/security/local_authentication.h"
#include "kivi/system/mach.h"
#include "kivi/system/process_info.h"
#include "kivi/system/sysctl.h"
#include "kivi/text/unicode_text.h"

namespace kivi {

namespace {

struct ModelRow {
  const char* identifier;
  const char* platformName;
  const char* hardwareName;
};

constexpr ModelRow kModels[] = {
    {"iPhone1,1", "iPhone 2G GSM", "iPhone1G"},
    {"iPhone1,2", "iPhone 3G GSM", "iPhone3G"},
    {"iPhone2,1", "iPhone 3GS GSM", "iPhone3GS"},
    {"iPhone3,1", "iPhone 4 GSM", "iPhone4"},
    {"iPhone3,2", "iPhone 4 GSM 2012", "iPhone3,2"},
    {"iPhone3,3", "iPhone 4 CDMA", "iPhone4"},
    {"iPhone4,1", "iPhone 4S", "iPhone4S"},
    {"iPhone5,1", "iPhone 5 GSM", "iPhone5"},
    {"iPhone5,2", "iPhone 5 CDMA", "iPhone5"},
    {"iPhone5,3", "iPhone 5c GSM", "iPhone5,3"},
    {"iPhone5,4", "iPhone 5c CDMA", "iPhone5,4"},
    {"iPhone6,1", "iPhone 5s GSM", "iPhone6,1"},
    {"iPhone6,2", "iPhone 5s CDMA", "iPhone6,2"},
    {"iPhone7,1", "iPhone 6 Plus", "iPhone7,1"},
    {"iPhone7,2", "iPhone 6", "iPhone7,2"},
    {"iPhone8,1", "iPhone 6s", "iPhone8,1"},
    {"iPhone8,2", "iPhone 6s Plus", "iPhone8,2"},
    {"iPhone8,4", "iPhone SE", "iPhone8,4"},
    {"iPod1,1", "iPod 1G", "iPod 1G"},
    {"iPod2,1", "iPod 2G", "iPod 2G"},
    {"iPod3,1", "iPod 3G", "iPod 3G"},
    {"iPod4,1", "iPod 4G", "iPod 4G"},
    {"iPod5,1", "iPod 5G", "iPod5,1"},
    {"iPod7,1", "iPod 6G", "iPod7,1"},
    {"iPad1,1", "iPad WiFi", "iPad"},
    {"iPad2,1", "iPad 2 WiFi", "iPad2"},
    {"iPad2,2", "iPad 2 GSM", "iPad2"},
    {"iPad2,3", "iPad 2 CDMAV", "iPad2"},
    {"iPad2,4", "iPad 2 CDMAS", "iPad2"},
    {"iPad2,5", "iPad Mini WiFi", "iPad Mini"},
    {"iPad2,6", "iPad Mini GSM", "iPad2,6"},
    {"iPad2,7", "iPad Mini CDMA", "iPad2,7"},
    {"iPad3,1", "iPad 3 WiFi", "iPad3"},
    {"iPad3,2", "iPad 3 CDMA", "iPad3"},
    {"iPad3,3", "iPad 3 GSM", "iPad3"},
    {"iPad3,4", "iPad 4 WiFi", "iPad3,4"},
    {"iPad3,5", "iPad 4 GSM", "iPad3,5"},
    {"iPad3,6", "iPad 4 CDMA", "iPad3,6"},
    {"iPad4,1", "iPad Air WiFi", "iPad4,1"},
    {"iPad4,2", "iPad Air Cellular", "iPad4,2"},
    {"iPad4,3", "iPad Air CDMA", "iPad4,3"},
    {"iPad4,4", "iPad Mini 2 Retina WiFi", "iPad4,4"},
    {"iPad4,5", "iPad Mini 2 Retina Cellular", "iPad4,5"},
    {"iPad4,6", "iPad Mini 2 CDMA", "iPad4,6"},
    {"iPad4,7", "iPad Mini 3 WiFi", "iPad4,7"},
    {"iPad4,8", "iPad Mini 3 Cellular", "iPad4,8"},
    {"iPad4,9", "iPad Mini 3 CDMA", "iPad4,9"},
    {"iPad5,1", "iPad Mini 4 WiFi", "iPad5,1"},
    {"iPad5,2", "iPad Mini 4 Cellular", "iPad5,2"},
    {"iPad5,3", "iPad Air 2 WiFi", "iPad5,3"},
    {"iPad5,4", "iPad Air 2 Cellular", "iPad5,4"},
    {"iPad6,3", "iPad Pro 9.7-inch WiFi", "iPad6,3"},
    {"iPad6,4", "iPad Pro 9.7-inch Cellular", "iPad6,4"},
    {"iPad6,7", "iPad Pro 12.9-inch WiFi", "iPad6,7"},
    {"iPad6,8", "iPad Pro 12.9-inch Cellular", "iPad6,8"},
    {"i386", "Simulator i386", "Simulator"},
    {"x86_64", "Simulator x86_64", "Simulator"},
};

std::once_flag gTableOnce;
const Dictionary* gTable = nullptr;

const Dictionary& modelTable() {
  std::call_once(gTableOnce, [] {
    auto* table = new Dictionary;  // lives as long as the process
    for (const ModelRow& row : kModels) {
      Dictionary record;
      record.emplace("PlatformName", Value(row.platformName));
      record.emplace("HardwareName", Value(row.hardwareName));
      table->emplace(row.identifier, Value(std::move(record)));
    }
    gTable = table;
  });
  return *gTable;
}

// Built when the library is loaded, before any operation can run.
[[maybe_unused]] const bool gTableBuiltAtLoad = (modelTable(), true);

std::string modelField(const char* field) {
  const auto machine = KivDevice::getSystemInformationByName("hw.machine");
  if (!machine) return "UnDetermined";
  const Value& row = modelTable().at(*machine);
  if (const Dictionary* record = row.asDictionary()) {
    if (const String* text = record->at(field).asString()) return std::string(text->view());
  }
  return *machine;
}

bool machineIsOneOf(std::string_view first, std::string_view second) {
  const auto machine = KivDevice::getSystemInformationByName("hw.machine");
  return machine && (*machine == first || *machine == second);
}

}  // namespace

const Dictionary& KivDevice::deviceNameMappingDictionary() { return modelTable(); }

std::optional<std::string> KivDevice::getSystemInformationByName(const char* name) {
  if (!name) return std::nullopt;
  std::size_t size = 0;
  if (sysctlbyname(name, nullptr, &size, nullptr, 0) != 0) return std::nullopt;
  char* buffer = static_cast<char*>(std::malloc(size > 0 ? size : 1));
  if (!buffer) return std::nullopt;
  std::optional<std::string> answer;
  if (sysctlbyname(name, buffer, &size, nullptr, 0) == 0) {
    const std::string_view bytes(buffer, size);
    const std::string_view text = bytes.substr(0, bytes.find('\0'));
    if (unicode::isValidUTF8(text)) answer = std::string(text);
  }
  std::free(buffer);
  return answer;
}

std::string KivDevice::platformName() { return modelField("PlatformName"); }

std::string KivDevice::hardwareModel() { return modelField("HardwareName"); }

bool KivDevice::isDeviceiPadPro() {
  static std::once_flag once;
  static bool answer = false;
  std::call_once(once, [] { answer = machineIsOneOf("iPad6,7", "iPad6,8"); });
  return answer;
}

bool KivDevice::isDeviceiPhoneX() {
  static std::once_flag once;
  static bool answer = false;
  std::call_once(once, [] { answer = machineIsOneOf("iPhone10,3", "iPhone10,6"); });
  return answer;
}

bool KivDevice::isCapableOfBiometricAuthForContext(const std::shared_ptr<LAContext>& context,
                                                   std::uint64_t biometricAuthType,
                                                   ErrorPtr* error) {
  ErrorPtr reported;
  bool capable = false;
  if (context &&
      context->canEvaluatePolicy(LAPolicyDeviceOwnerAuthenticationWithBiometrics, &reported)) {
    switch (context->biometryType()) {
      case LABiometryTypeTouchID:
        capable = biometricAuthType == KivBiometricAuthTypeTouchID;
        break;
      case LABiometryTypeFaceID:
        capable = biometricAuthType == KivBiometricAuthTypeFaceID;
        break;
      default:
        break;
    }
  }
  if (error) *error = reported;
  return capable;
}

bool KivDevice::isTouchIDCapableWithError(ErrorPtr* error) {
  return isCapableOfBiometricAuthForContext(std::make_shared<LAContext>(),
                                            KivBiometricAuthTypeTouchID, error);
}

bool KivDevice::isFaceIDCapableWithError(ErrorPtr* error) {
  return isCapableOfBiometricAuthForContext(std::make_shared<LAContext>(),
                                            KivBiometricAuthTypeFaceID, error);
}

bool KivDevice::isDeviceBiometricsCapableWithError(ErrorPtr* error) {
  if (isTouchIDCapableWithError(error)) return true;
  return isFaceIDCapableWithError(error);
}

namespace {

bool readVMInfo(task_vm_info_data_t& info) {
  mach_msg_type_number_t count = TASK_VM_INFO_COUNT;
  return task_info(mach_task_self(), TASK_VM_INFO, reinterpret_cast<task_info_t>(&info), &count) ==
         KERN_SUCCESS;
}

bool readBasicInfo(task_basic_info_64_data_t& info) {
  mach_msg_type_number_t count = TASK_BASIC_INFO_64_COUNT;
  return task_info(mach_task_self(), TASK_BASIC_INFO_64, reinterpret_cast<task_info_t>(&info),
                   &count) == KERN_SUCCESS;
}

// Free page count times page size, or nothing.
std::optional<std::uint64_t> freeBytes() {
  vm_size_t pageSize = 0;
  if (host_page_size(mach_host_self(), &pageSize) != KERN_SUCCESS) return std::nullopt;
  vm_statistics_data_t statistics{};
  mach_msg_type_number_t count = HOST_VM_INFO_COUNT;
  if (host_statistics(mach_host_self(), HOST_VM_INFO, reinterpret_cast<host_info_t>(&statistics),
                      &count) != KERN_SUCCESS) {
    return std::nullopt;
  }
  return static_cast<std::uint64_t>(statistics.free_count) * pageSize;
}

// A byte count as a signed figure: counts past the signed range (a corrupt
// /proc file can claim them) stay at its top instead of turning negative.
std::int64_t signedBytes(std::uint64_t bytes) {
  return static_cast<std::int64_t>(
      std::min<std::uint64_t>(bytes, std::numeric_limits<std::int64_t>::max()));
}

}  // namespace

std::int64_t KivDevice::processResidentSize() {
  task_vm_info_data_t info{};
  return readVMInfo(info) ? signedBytes(info.resident_size) : -1;
}

std::int64_t KivDevice::processPhysicalFootprint() {
  task_vm_info_data_t info{};
  return readVMInfo(info) ? signedBytes(info.phys_footprint) : -1;
}

std::int64_t KivDevice::physicalMemory() {
  return signedBytes(ProcessInfo::processInfo().physicalMemory());
}

std::int64_t KivDevice::percentCpuUsage() {
  task_basic_info_64_data_t basic{};
  if (!readBasicInfo(basic)) return -1;
  thread_act_array_t threads = nullptr;
  mach_msg_type_number_t threadCount = 0;
  if (task_threads(mach_task_self(), &threads, &threadCount) != KERN_SUCCESS) return -1;
  std::int64_t total = 0;
  for (mach_msg_type_number_t i = 0; i < threadCount; ++i) {
    thread_basic_info_data_t info{};
    mach_msg_type_number_t count = THREAD_BASIC_INFO_COUNT;
    if (thread_info(threads[i], THREAD_BASIC_INFO, reinterpret_cast<thread_info_t>(&info),
                    &count) != KERN_SUCCESS) {
      total = -1;
      break;
    }
    if (info.flags & TH_FLAGS_IDLE) continue;
    const float share = static_cast<float>(info.cpu_usage) / static_cast<float>(TH_USAGE_SCALE);
    total = static_cast<std::int64_t>(
        std::trunc(static_cast<double>(share) * 100.0 + static_cast<double>(total)));
  }
  vm_deallocate(mach_task_self(), reinterpret_cast<vm_address_t>(threads),
                threadCount * sizeof(thread_act_t));
  return total;
}

std::int64_t KivDevice::processFreeMemory() {
  const auto bytes = freeBytes();
  return bytes ? signedBytes(*bytes) : -1;
}

std::uint64_t KivDevice::totalMemory() {
  const std::uint64_t value = getSystemInformationForSpecifier(HW_PHYSMEM);
  return value == kKivDeviceUnknown ? value : value >> 20;
}

std::uint64_t KivDevice::userMemory() {
  const std::uint64_t value = getSystemInformationForSpecifier(HW_USERMEM);
  return value == kKivDeviceUnknown ? value : value >> 20;
}

std::uint64_t KivDevice::applicationMemory() {
  task_basic_info_64_data_t info{};
  return readBasicInfo(info) ? info.resident_size >> 20 : kKivDeviceUnknown;
}

std::uint64_t KivDevice::freeMemory() {
  const auto bytes = freeBytes();
  return bytes ? *bytes >> 20 : kKivDeviceUnknown;
}

std::uint64_t KivDevice::getSystemInformationForSpecifier(std::int32_t selector) {
  const int name[2] = {CTL_HW, selector};
  std::int32_t value = 0;
  std::size_t size = sizeof value;
  if (sysctl(name, 2, &value, &size, nullptr, 0) != 0) return kKivDeviceUnknown;
  return static_cast<std::uint64_t>(static_cast<std::int64_t>(value));
}

}  // namespace kivi

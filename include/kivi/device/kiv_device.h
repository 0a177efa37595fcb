// KivDevice: what machine this is and how much of it the process uses.
//
// Class-level operations only. The machine identifier is the kernel's
// "hw.machine" (uname's machine on Linux: "x86_64", "aarch64"), looked up in a
// fixed table of model names; an identifier the table lacks names itself.
// Biometric capability asks a local-authentication context, which on Linux
// finds the fingerprint readers and enrolled fingers of the desktop's
// fingerprint service. The memory and CPU figures come from the task, thread
// and host information of the system layer (see kivi/system/mach.h for the
// Linux source of each).
//
//   std::string model = kivi::KivDevice::platformName();   // "Simulator x86_64"
//   std::int64_t rss = kivi::KivDevice::processResidentSize();
//   kivi::ErrorPtr error;
//   if (!kivi::KivDevice::isTouchIDCapableWithError(&error)) log(error);
//
// Failures are in band: null from getSystemInformationByName, "UnDetermined"
// from the model names, false from the tests, -1 from the signed figures and
// the all-ones value (kKivDeviceUnknown) from the unsigned ones. Nothing
// throws or logs.
//
// Thread contract: every operation may be called from any thread. The model
// table is built once, when the library is loaded; the two model tests are
// worked out on their first call, once, and never again in the process.
#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>

#include "kivi/base/error.h"
#include "kivi/base/object.h"
#include "kivi/base/value.h"
#include "kivi/export.h"

namespace kivi {

class LAContext;

// The biometric kinds of isCapableOfBiometricAuthForContext.
inline constexpr std::uint64_t KivBiometricAuthTypeTouchID = 0;
inline constexpr std::uint64_t KivBiometricAuthTypeFaceID = 1;

// The all-ones answer of the unsigned figures.
inline constexpr std::uint64_t kKivDeviceUnknown = UINT64_MAX;

class KIVI_EXPORT KivDevice : public Object {
 public:
  KivDevice() = delete;

  // Machine identifier -> {"PlatformName": ..., "HardwareName": ...}.
  static const Dictionary& deviceNameMappingDictionary();

  // The named kernel value as text ("hw.machine"), or null.
  static std::optional<std::string> getSystemInformationByName(const char* name);
  // The machine identifier's "PlatformName" ("Simulator x86_64") and "HardwareName"
  // ("Simulator"): the identifier itself when the table lacks it, "UnDetermined" when it
  // cannot be read.
  static std::string platformName();
  static std::string hardwareModel();
  // Whether the machine identifier names one of those models (never true on a PC).
  static bool isDeviceiPadPro();
  static bool isDeviceiPhoneX();

  // Whether `context` finds a reader of the kind KivBiometricAuthType… names (TouchID: a
  // fingerprint reader) with a finger of this user enrolled; false for a null context.
  // `error`, when not null, receives the context's error (null when capable).
  static bool isCapableOfBiometricAuthForContext(const std::shared_ptr<LAContext>& context,
                                                 std::uint64_t biometricAuthType, ErrorPtr* error);
  // The same with a new LAContext: for a fingerprint reader, for a face reader (never found
  // here), or for either.
  static bool isTouchIDCapableWithError(ErrorPtr* error);
  static bool isFaceIDCapableWithError(ErrorPtr* error);
  static bool isDeviceBiometricsCapableWithError(ErrorPtr* error);

  // This process's resident size and own memory (task_vm_info_data_t's resident_size and
  // phys_footprint), in bytes, or -1.
  static std::int64_t processResidentSize();
  static std::int64_t processPhysicalFootprint();
  // Bytes of memory installed (ProcessInfo::physicalMemory()); 0 when unknown.
  static std::int64_t physicalMemory();
  // Whole percent over the process's threads (above 100 with several
  // processors busy), or -1.
  static std::int64_t percentCpuUsage();
  // Bytes of the machine's memory that are free, or -1.
  static std::int64_t processFreeMemory();
  // MiB, or kKivDeviceUnknown: the memory installed and that left to users (hw.physmem and
  // hw.usermem, so at most 2047), this process's resident size, the machine's free memory.
  static std::uint64_t totalMemory();
  static std::uint64_t userMemory();
  static std::uint64_t applicationMemory();
  static std::uint64_t freeMemory();
  // The kernel's CTL_HW value for `selector`, as a signed 32-bit integer
  // widened to 64 bits, or kKivDeviceUnknown. On a machine with more than
  // 2 GiB, HW_PHYSMEM and HW_USERMEM answer 2147483647, as the 32-bit
  // selectors do.
  static std::uint64_t getSystemInformationForSpecifier(std::int32_t selector);
};

}  // namespace kivi

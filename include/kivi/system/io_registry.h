// The I/O registry's lookup of the machine's firmware facts: find the
// platform device, read its properties, release the handle.
//
//   kivi::io_service_t device = kivi::IOServiceGetMatchingService(
//       kivi::kIOMainPortDefault, kivi::IOServiceMatching("IOPlatformExpertDevice"));
//   if (device != 0) {
//     kivi::Value serial = kivi::IORegistryEntryCreateCFProperty(
//         device, "IOPlatformSerialNumber", nullptr, 0);
//     if (const kivi::String* text = serial.asString()) ...
//     kivi::IOObjectRelease(device);
//   }
//
// One class is known: "IOPlatformExpertDevice", present when the firmware
// describes the machine through DMI (/sys/class/dmi/id/) or a device tree
// (/proc/device-tree/ or /sys/firmware/devicetree/base/); paths are under
// kivi::system::root(). Its properties, each a String read when asked for:
//   "IOPlatformSerialNumber"  DMI product_serial, else the device tree's
//       serial-number. A source that cannot be read (DMI's serial is readable
//       only by root), is empty, is not UTF-8 text or holds a placeholder the
//       firmware was shipped with is skipped. The placeholders, compared without
//       surrounding white space and ignoring case, are
//         "To Be Filled By O.E.M."  "Not Specified"  "System Serial Number"
//         "Default string"  "0"  "None"
//       No usable source: the property is absent.
//   "model"         DMI product_name, else the device tree's model
//   "manufacturer"  DMI sys_vendor
// Text that is not UTF-8 makes any property absent. The text is kept as the
// firmware has it (surrounding spaces included);
// only the kernel's framing goes: the newline after a DMI value and the NUL
// after a device-tree string. An absent property is a null Value.
//
// Each successful IOServiceGetMatchingService answers a new nonzero handle
// that the caller gives back with IOObjectRelease.
//
// Thread contract: every function may be called from any thread at once; a
// handle may be used from any thread until it is released.
#pragma once

#include <cstdint>

#include "kivi/base/value.h"
#include "kivi/export.h"
#include "kivi/system/mach.h"

namespace kivi {

// A handle on a registry object, a service or an entry whose properties are read; 0 is none.
using io_object_t = mach_port_t;
using io_service_t = io_object_t;
using io_registry_entry_t = io_object_t;
// Option flags of the property lookup (none is used).
using IOOptionBits = std::uint32_t;

// The default main port, the one IOServiceGetMatchingService accepts (kIOMasterPortDefault is
// its older name).
inline constexpr mach_port_t kIOMasterPortDefault = 0;
inline constexpr mach_port_t kIOMainPortDefault = 0;

// {"IOProviderClass": name}; a null name gives an empty Dictionary.
KIVI_EXPORT Dictionary IOServiceMatching(const char* name);
// A new handle on the first service whose class is the dictionary's
// "IOProviderClass"; 0 when nothing matches or mainPort is not the default.
KIVI_EXPORT io_service_t IOServiceGetMatchingService(mach_port_t mainPort, Dictionary matching);
// The property `key` of `entry`; a null Value when absent or when `entry` is
// not a live handle. `allocator` and `options` are accepted and unused.
KIVI_EXPORT Value IORegistryEntryCreateCFProperty(io_registry_entry_t entry, const String& key,
                                                  const void* allocator, IOOptionBits options);
// Gives a handle back; KERN_INVALID_ARGUMENT for one that is not live.
KIVI_EXPORT kern_return_t IOObjectRelease(io_object_t object);

}  // namespace kivi

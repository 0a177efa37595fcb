// KivDeviceAttributes: the machine's hardware serial number, as the firmware
// states it.
//
// The serial comes from the I/O registry's platform-expert service (see
// kivi/system/io_registry.h): on x86 machines the DMI product serial, on ARM
// boards the device tree's serial number. Reading the DMI serial needs root,
// and virtual machines often have none: then the answer is absent. White
// space and line breaks at either end are removed.
//
//   kivi::KivDeviceAttributes attributes;
//   if (auto serial = attributes.getMacHardwareSerialNumber()) report(*serial);
//
// Thread contract: stateless; any thread, any number at once.
#pragma once

#include <optional>
#include <string>

#include "kivi/base/object.h"
#include "kivi/device/kiv_device_attributes_protocol.h"
#include "kivi/export.h"

namespace kivi {

class KIVI_EXPORT KivDeviceAttributes : public Object, public KivDeviceAttributesProtocol {
 public:
  KivDeviceAttributes() = default;

  std::optional<std::string> getMacHardwareSerialNumber() override;

  std::string description() const override { return Object::description(); }
};

}  // namespace kivi

// KivDeviceAttributesProtocol: the machine's hardware serial number, behind
// an interface so that a host's components can be handed the real provider
// (KivDeviceAttributes) or the scriptable double (MockKivDeviceAttributes).
//
//   void Enrolment::setDevice(std::shared_ptr<kivi::KivDeviceAttributesProtocol> device);
//   auto serial = device->getMacHardwareSerialNumber();   // std::optional<std::string>
//
// Thread contract: that of the implementation; KivDeviceAttributes may be
// called from any thread.
#pragma once

#include <optional>
#include <string>

#include "kivi/export.h"

namespace kivi {

class KIVI_EXPORT KivDeviceAttributesProtocol {
 public:
  virtual ~KivDeviceAttributesProtocol() = default;

  // The base object interface.
  virtual std::string description() const = 0;

  // The serial number, or absent.
  virtual std::optional<std::string> getMacHardwareSerialNumber() = 0;
};

}  // namespace kivi

// MockKivDeviceAttributes: a scriptable KivDeviceAttributesProtocol.
//
// getMacHardwareSerialNumber() answers what getMacHardwareSerialNumberBlock
// answers; without the block it answers absent. Nothing reaches the machine.
//
//   auto device = std::make_shared<kivi::MockKivDeviceAttributes>();
//   device->getMacHardwareSerialNumberBlock = [] { return std::optional<std::string>("C02XYZ"); };
//   enrolment.setDevice(device);
//
// Thread contract: none; the block runs synchronously on the calling thread.
// Set it before handing the double out.
#pragma once

#include <functional>
#include <optional>
#include <string>

#include "kivi/base/object.h"
#include "kivi/device/kiv_device_attributes_protocol.h"
#include "kivi/export.h"

namespace kivi {

class KIVI_EXPORT MockKivDeviceAttributes : public Object, public KivDeviceAttributesProtocol {
 public:
  MockKivDeviceAttributes() = default;

  // Answers getMacHardwareSerialNumber(); without it, nullopt.
  std::function<std::optional<std::string>()> getMacHardwareSerialNumberBlock;

  std::optional<std::string> getMacHardwareSerialNumber() override;

  std::string description() const override { return Object::description(); }
};

}  // namespace kivi

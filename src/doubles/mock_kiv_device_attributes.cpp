#include "kivi/doubles/mock_kiv_device_attributes.h"

namespace kivi {

std::optional<std::string> MockKivDeviceAttributes::getMacHardwareSerialNumber() {
  if (getMacHardwareSerialNumberBlock) return getMacHardwareSerialNumberBlock();
  return std::nullopt;
}

}  // namespace kivi

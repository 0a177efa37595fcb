#include "kivi/device/kiv_device_attributes.h"

#include "kivi/system/io_registry.h"
#include "kivi/text/unicode_text.h"

namespace kivi {

std::optional<std::string> KivDeviceAttributes::getMacHardwareSerialNumber() {
  const io_service_t service = IOServiceGetMatchingService(
      kIOMasterPortDefault, IOServiceMatching("IOPlatformExpertDevice"));
  if (!service) return std::nullopt;
  const Value property =
      IORegistryEntryCreateCFProperty(service, String("IOPlatformSerialNumber"), nullptr, 0);
  IOObjectRelease(service);
  const String* serial = property.asString();
  if (!serial) return std::nullopt;
  return unicode::trim(serial->view());
}

}  // namespace kivi

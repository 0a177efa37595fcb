// kivi device: every fact the library knows about this machine and process.
#include <algorithm>
#include <cstdint>
#include <ostream>
#include <string>
#include <utility>
#include <vector>

#include "command.h"
#include "kivi/device/eu_locale_detector.h"
#include "kivi/device/kiv_application_prefix_provider.h"
#include "kivi/device/kiv_device.h"
#include "kivi/device/kiv_device_attributes.h"
#include "kivi/system/locale_info.h"
#include "kivi/text/json_serialization.h"

namespace kivi::tool {

namespace {

using Fact = std::pair<std::string, Value>;

Value optionalText(const std::optional<std::string>& text, const char* absent) {
  return text ? Value(*text) : Value(absent);
}

Value unsignedFigure(std::uint64_t value) {
  return value == kKivDeviceUnknown ? Value("unknown") : Value(value);
}

Value signedFigure(std::int64_t value) { return value < 0 ? Value("unknown") : Value(value); }

// "true", or "false (<the error>)".
Value capability(bool capable, const ErrorPtr& error) {
  if (capable) return Value(true);
  if (!error) return Value(false);
  return Value("false (" + error->localizedDescription() + ", " + error->domain() + " " +
               std::to_string(error->code()) + ")");
}

std::vector<Fact> gatherFacts() {
  std::vector<Fact> facts;
  facts.emplace_back("machine",
                     optionalText(KivDevice::getSystemInformationByName("hw.machine"), "unknown"));
  facts.emplace_back("platformName", Value(KivDevice::platformName()));
  facts.emplace_back("hardwareModel", Value(KivDevice::hardwareModel()));
  facts.emplace_back("isDeviceiPadPro", Value(KivDevice::isDeviceiPadPro()));
  facts.emplace_back("isDeviceiPhoneX", Value(KivDevice::isDeviceiPhoneX()));
  facts.emplace_back("processResidentSize (bytes)", signedFigure(KivDevice::processResidentSize()));
  facts.emplace_back("processPhysicalFootprint (bytes)",
                     signedFigure(KivDevice::processPhysicalFootprint()));
  facts.emplace_back("physicalMemory (bytes)", signedFigure(KivDevice::physicalMemory()));
  facts.emplace_back("processFreeMemory (bytes)", signedFigure(KivDevice::processFreeMemory()));
  facts.emplace_back("totalMemory (MiB)", unsignedFigure(KivDevice::totalMemory()));
  facts.emplace_back("userMemory (MiB)", unsignedFigure(KivDevice::userMemory()));
  facts.emplace_back("applicationMemory (MiB)", unsignedFigure(KivDevice::applicationMemory()));
  facts.emplace_back("freeMemory (MiB)", unsignedFigure(KivDevice::freeMemory()));
  facts.emplace_back("percentCpuUsage (%)", signedFigure(KivDevice::percentCpuUsage()));
  ErrorPtr error;
  const bool touchID = KivDevice::isTouchIDCapableWithError(&error);
  facts.emplace_back("touchID", capability(touchID, error));
  const bool faceID = KivDevice::isFaceIDCapableWithError(&error);
  facts.emplace_back("faceID", capability(faceID, error));
  facts.emplace_back("serialNumber",
                     optionalText(KivDeviceAttributes().getMacHardwareSerialNumber(), "absent"));
  const auto prefix = KivApplicationPrefixProvider::applicationIdentifierPrefixWithError(&error);
  if (prefix) {
    facts.emplace_back("applicationIdentifierPrefix", Value(*prefix));
  } else if (error) {
    facts.emplace_back("applicationIdentifierPrefix", Value("none (" + error->domain() + " " +
                                                            std::to_string(error->code()) + ")"));
  } else {
    facts.emplace_back("applicationIdentifierPrefix", Value("none"));
  }
  facts.emplace_back("region", optionalText(Locale::currentLocale()->countryCode(), "none"));
  facts.emplace_back("timeZone", Value(TimeZone::localTimeZone()->name()));
  facts.emplace_back(
      "locatedInEU",
      Value(EULocaleDetector::doesDeviceAppearToBeLocatedInEUBasedOnLocaleAndTimeZone()));
  return facts;
}

std::string text(const Value& value) {
  if (const String* s = value.asString()) return std::string(s->view());
  if (const Number* n = value.asNumber()) {
    if (n->isBool()) return n->boolValue() ? "true" : "false";
    return n->stringValue();
  }
  return value.description();
}

int runDevice(const std::vector<std::string>& args, std::ostream& out, std::ostream& err) {
  const bool json = args.size() == 1 && args[0] == "--json";
  if (!args.empty() && !json) {
    err << "kivi device: unexpected argument '" << args[0] << "' (see kivi device --help)\n";
    return 2;
  }
  const std::vector<Fact> facts = gatherFacts();
  if (json) {
    Dictionary object;
    // Scripts get the operation's name alone; the unit is the operation's.
    for (const auto& [name, value] : facts) object.emplace(name.substr(0, name.find(" (")), value);
    ErrorPtr error;
    const auto data = JSONSerialization::dataWithJSONObject(
        Value(std::move(object)), JSONWritingPrettyPrinted | JSONWritingSortedKeys, &error);
    if (!data) {
      err << "kivi device: " << (error ? error->localizedDescription() : "no JSON") << "\n";
      return 1;
    }
    out << std::string(data->begin(), data->end()) << "\n";
    return 0;
  }
  std::size_t width = 0;
  for (const auto& fact : facts) width = std::max(width, fact.first.size());
  for (const auto& [name, value] : facts) {
    out << name << ":" << std::string(width - name.size() + 1, ' ') << text(value) << "\n";
  }
  return 0;
}

}  // namespace

Command deviceCommand() {
  return {"device", "print the facts about this machine and process",
          "usage: kivi device [--json]\n\n"
          "Prints every device and environment fact in aligned 'name: value' lines:\n"
          "the machine identifier and its model names, the two model tests, each\n"
          "memory figure in the unit its operation gives, the CPU use of this\n"
          "process, fingerprint capability (with the reason when there is none),\n"
          "the firmware's serial number, the application identifier prefix from\n"
          "the keychain, the locale's region, the local time zone and the EU\n"
          "decision. With --json, the same facts as one JSON object. A figure that\n"
          "cannot be read shows as \"unknown\".\n",
          runDevice};
}

const CommandRegistration kRegistration{45, &deviceCommand};

}  // namespace kivi::tool

// EULocaleDetector: whether the device appears to be in the European Union
// or a neighbouring country or territory, from the region of the current
// locale and, failing that, the local time zone (kivi/system/locale_info.h
// says where Linux keeps each).
//
// The region list: "AT", "BE", "BG", "HR", "CY", "CZ", "DK", "EE", "FI",
// "FR", "DE", "GR", "HU", "IE", "IS", "IT", "LV", "LI", "LT", "LU", "MT",
// "NL", "NO", "PL", "PT", "RO", "SK", "SI", "ES", "SE", "GB", "GI", "JE",
// "IM", "CH". A region matches after full Unicode upper-casing ("de" is
// "DE"), with no trimming. The time-zone list holds 37 IANA names (the EU's
// and its neighbours' capitals and territories, plus "GMT"; "Europe/London"
// is not one of them); a zone matches by exact, case-sensitive name.
//
//   bool eu = kivi::EULocaleDetector::doesDeviceAppearToBeLocatedInEUBasedOnLocaleAndTimeZone();
//   auto detector = kivi::EULocaleDetector::createEULocaleDetector();   // for injection
//
// Thread contract: any thread. Each list is built once, on first use.
#pragma once

#include <memory>
#include <optional>
#include <string>

#include "kivi/base/object.h"
#include "kivi/device/eu_locale_detector_protocol.h"
#include "kivi/export.h"

namespace kivi {

class TimeZone;

class KIVI_EXPORT EULocaleDetector : public Object {
 public:
  EULocaleDetector() = delete;

  // A new detector on every call (always an EULocaleDetector_Mac).
  static std::shared_ptr<EULocaleDetectorProtocol> createEULocaleDetector();
  // Whether the current locale's region is on the region list, or else the local time zone
  // on the time-zone list; both are read afresh on each call.
  static bool doesDeviceAppearToBeLocatedInEUBasedOnLocaleAndTimeZone();
  // Whether the region code or the zone is on its list (see above); false for null.
  static bool isEUCountryCode(const std::optional<std::string>& code);
  static bool isEUTimeZone(const std::shared_ptr<const TimeZone>& timeZone);
};

// The detector createEULocaleDetector() makes: it answers from this machine's locale and time
// zone.
class KIVI_EXPORT EULocaleDetector_Mac : public Object, public EULocaleDetectorProtocol {
 public:
  EULocaleDetector_Mac() = default;

  // EULocaleDetector::doesDeviceAppearToBeLocatedInEUBasedOnLocaleAndTimeZone().
  bool doesDeviceAppearToBeLocatedInEU() override;

  std::string description() const override { return Object::description(); }
};

}  // namespace kivi

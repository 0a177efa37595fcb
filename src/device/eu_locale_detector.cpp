#include "kivi/device/eu_locale_detector.h"

#include <algorithm>
#include <array>
#include <string_view>

#include "kivi/system/locale_info.h"
#include "kivi/text/unicode_text.h"

namespace kivi {

namespace {

const std::array<std::string_view, 35>& regions() {
  static const std::array<std::string_view, 35> list = {
      "AT", "BE", "BG", "HR", "CY", "CZ", "DK", "EE", "FI", "FR", "DE", "GR",
      "HU", "IE", "IS", "IT", "LV", "LI", "LT", "LU", "MT", "NL", "NO", "PL",
      "PT", "RO", "SK", "SI", "ES", "SE", "GB", "GI", "JE", "IM", "CH"};
  return list;
}

const std::array<std::string_view, 37>& timeZones() {
  static const std::array<std::string_view, 37> list = {"Europe/Amsterdam",
                                                        "Europe/Andorra",
                                                        "Europe/Athens",
                                                        "Europe/Berlin",
                                                        "Europe/Bratislava",
                                                        "Europe/Brussels",
                                                        "Europe/Bucharest",
                                                        "Europe/Budapest",
                                                        "Europe/Busingen",
                                                        "Europe/Copenhagen",
                                                        "Europe/Dublin",
                                                        "Europe/Helsinki",
                                                        "Europe/Lisbon",
                                                        "Europe/Ljubljana",
                                                        "Europe/Luxembourg",
                                                        "Europe/Madrid",
                                                        "Europe/Malta",
                                                        "Europe/Mariehamn",
                                                        "Europe/Monaco",
                                                        "Europe/Oslo",
                                                        "Europe/Paris",
                                                        "Europe/Prague",
                                                        "Europe/Riga",
                                                        "Europe/Rome",
                                                        "Europe/Sofia",
                                                        "Europe/Stockholm",
                                                        "Europe/Tallinn",
                                                        "Europe/Vaduz",
                                                        "Europe/Vienna",
                                                        "Europe/Vilnius",
                                                        "Europe/Warsaw",
                                                        "Europe/Zagreb",
                                                        "Europe/Zurich",
                                                        "Europe/Gibraltar",
                                                        "Europe/Isle_of_Man",
                                                        "Europe/Jersey",
                                                        "GMT"};
  return list;
}

template <class List>
bool holds(const List& list, std::string_view text) {
  return std::find(list.begin(), list.end(), text) != list.end();
}

}  // namespace

std::shared_ptr<EULocaleDetectorProtocol> EULocaleDetector::createEULocaleDetector() {
  return std::make_shared<EULocaleDetector_Mac>();
}

bool EULocaleDetector::doesDeviceAppearToBeLocatedInEUBasedOnLocaleAndTimeZone() {
  if (isEUCountryCode(Locale::currentLocale()->countryCode())) return true;
  return isEUTimeZone(TimeZone::localTimeZone());
}

bool EULocaleDetector::isEUCountryCode(const std::optional<std::string>& code) {
  if (!code) return false;
  return holds(regions(), unicode::toUpper(*code));
}

bool EULocaleDetector::isEUTimeZone(const std::shared_ptr<const TimeZone>& timeZone) {
  if (!timeZone) return false;
  return holds(timeZones(), timeZone->name());
}

bool EULocaleDetector_Mac::doesDeviceAppearToBeLocatedInEU() {
  return EULocaleDetector::doesDeviceAppearToBeLocatedInEUBasedOnLocaleAndTimeZone();
}

}  // namespace kivi

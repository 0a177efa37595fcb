// The user's locale and the machine's local time zone, as a desktop
// application finds them on Linux.
//
//   auto region = kivi::Locale::currentLocale()->countryCode();   // "DE", or nullopt
//   std::string zone = kivi::TimeZone::localTimeZone()->name();   // "Europe/Berlin"
//
// The current locale is ICU's default locale, which ICU takes from the
// environment (LC_ALL, then LC_MESSAGES, then LANG) the first time it is
// asked, or which the host set with icu::Locale::setDefault. The C and POSIX
// locales name no region: their country code is absent.
//
// The local time zone's identifier is the IANA name, found in this order:
//   1. TZ: ":Europe/Paris" or "Europe/Paris" (a name the zoneinfo directory
//      holds), or a path inside a zoneinfo directory; TZ set but empty is
//      "UTC". A POSIX rule ("CET-1CEST") names no zone and is passed over.
//   2. /etc/localtime, a link into the zoneinfo directory: the name after
//      "zoneinfo/" ("posix/" and "right/" trees give the plain name).
//   3. /etc/timezone, the name it holds, if the zoneinfo directory has it.
//   4. "UTC", which is what the C library uses when none of them is there.
// Files are read under kivi::system::root(), and the zone's name is read
// afresh on every call to localTimeZone().
//
// Thread contract: both classes are immutable values; any thread may call.
#pragma once

#include <memory>
#include <optional>
#include <string>

#include "kivi/export.h"

namespace kivi {

// A locale, named by its identifier ("de_DE").
class KIVI_EXPORT Locale {
 public:
  // The user's locale: ICU's default locale.
  static std::shared_ptr<const Locale> currentLocale();
  // "de_DE", "en_US_POSIX", "fr".
  static std::shared_ptr<const Locale> localeWithLocaleIdentifier(std::string identifier);

  // The identifier the locale was made with.
  const std::string& localeIdentifier() const { return identifier_; }
  // The region ("DE"), absent when the locale names none.
  std::optional<std::string> countryCode() const;

  // As localeWithLocaleIdentifier: the identifier is kept as given, not checked.
  explicit Locale(std::string identifier) : identifier_(std::move(identifier)) {}

 private:
  std::string identifier_;
};

// A time zone, named by its IANA identifier ("Europe/Berlin").
class KIVI_EXPORT TimeZone {
 public:
  // The machine's zone, found afresh as the list above says; "UTC" when nothing names one.
  static std::shared_ptr<const TimeZone> localTimeZone();
  // A zone by its IANA name; null unless the zoneinfo directory holds it
  // ("UTC" and "GMT" always exist).
  static std::shared_ptr<const TimeZone> timeZoneWithName(const std::string& name);

  // The IANA identifier.
  const std::string& name() const { return name_; }

  // A zone of that name, unchecked (timeZoneWithName checks).
  explicit TimeZone(std::string name) : name_(std::move(name)) {}

 private:
  std::string name_;
};

}  // namespace kivi

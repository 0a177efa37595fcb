// DateFormatter: dates to text and back with a fixed ICU date pattern.
//
// A formatter holds a pattern in ICU syntax ("yyyy-MM-dd'T'HH:mm:ss.SSSZ"),
// and optionally a locale and a time zone. Without a locale it uses the
// process's default ICU locale and without a time zone the default ICU time
// zone, both read afresh on every call, so a formatter follows later changes
// of the defaults (icu::Locale::setDefault, icu::TimeZone::adoptDefault).
//
//   kivi::DateFormatter formatter("yyyy-MM-dd'T'HH:mm:ss.SSSZ");
//   formatter.stringFromDate(kivi::Date{0});          // "1970-01-01T00:00:00.000+0000" in UTC
//   formatter.dateFromString("2021-03-04T05:06:07.089+0000");  // Date{1614834367.089}
//
//   kivi::DateFormatter fixed("EEEE d MMMM", "fr_FR", "Europe/Paris");
//
// Parsing is strict: the whole text must match the pattern (no leniency, no
// missing fields, nothing left over) and name a real calendar date; otherwise
// the answer is std::nullopt. As ICU parses, white space may stand before a
// field ("2021- 03-04" matches "yyyy-MM-dd"), and a zone field takes any of
// ICU's offset forms ("+0000", "+00:00", "Z", "GMT"). A zone offset in the text
// decides the instant; the formatter's time zone only fills in for a pattern
// without a zone field. Text that is not valid UTF-8 never parses, nor does
// text longer than any date could be (256 bytes plus 64 for each byte of the
// pattern).
//
// Formatting rounds the date to the nearest millisecond. A date that is not
// finite or lies outside the calendar's range formats as the empty string.
// A pattern ICU refuses formats everything as the empty string and parses
// nothing; an unknown time zone identifier is ICU's unknown zone, which
// behaves as UTC.
//
// Thread contract: a formatter is immutable once made; any number of threads
// may format and parse with the same formatter at the same time.
#pragma once

#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include "kivi/base/value.h"
#include "kivi/export.h"

namespace kivi {

class KIVI_EXPORT DateFormatter {
 public:
  // `localeIdentifier` is an ICU locale name ("en_US_POSIX", "de-CH"),
  // `timeZoneIdentifier` an ICU zone ("UTC", "America/St_Johns", "GMT+05:45").
  explicit DateFormatter(std::string dateFormat,
                         std::optional<std::string> localeIdentifier = std::nullopt,
                         std::optional<std::string> timeZoneIdentifier = std::nullopt);

  ~DateFormatter();
  DateFormatter(const DateFormatter&) = delete;
  DateFormatter& operator=(const DateFormatter&) = delete;

  // The pattern given at creation.
  const std::string& dateFormat() const noexcept;
  // Absent when the formatter follows the process default.
  const std::optional<std::string>& localeIdentifier() const noexcept;
  const std::optional<std::string>& timeZoneIdentifier() const noexcept;

  // The date as text, or the text as a date, by the pattern (see above for what fails).
  std::string stringFromDate(Date date) const;
  std::optional<Date> dateFromString(std::string_view text) const;

 private:
  struct Impl;
  const std::unique_ptr<Impl> impl_;
};

}  // namespace kivi

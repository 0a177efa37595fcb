#include "kivi/text/date_formatter.h"

#include <unicode/calendar.h>
#include <unicode/locid.h>
#include <unicode/parsepos.h>
#include <unicode/smpdtfmt.h>
#include <unicode/timezone.h>
#include <unicode/unistr.h>

#include <cmath>
#include <mutex>
#include <utility>
#include <vector>

#include "kivi/text/unicode_text.h"

namespace kivi {
namespace {

icu::UnicodeString utf16(std::string_view text) {
  return icu::UnicodeString::fromUTF8(
      icu::StringPiece(text.data(), static_cast<int32_t>(text.size())));
}

// An ICU formatter, which is not safe to share between threads, and the name
// of the locale it was made for.
struct Slot {
  std::unique_ptr<icu::SimpleDateFormat> format;
  std::string localeName;
};

// Idle ICU formatters a DateFormatter keeps for reuse; more are freed after
// use. Enough for the threads that typically format at the same time.
constexpr std::size_t kMaxIdle = 8;

// No date a pattern can produce is longer than this many bytes; longer text is
// refused before ICU, whose number parsing grows quadratically with the length
// of a run of digits.
std::size_t maxDateTextLength(std::string_view pattern) { return 256 + 64 * pattern.size(); }

}  // namespace

// Each call borrows an ICU formatter from a small pool, so that calls on
// different threads never share one and each call pays for making a formatter
// only when every pooled one is busy.
struct DateFormatter::Impl {
  const std::string pattern;
  const std::optional<std::string> localeIdentifier;
  const std::optional<std::string> timeZoneIdentifier;

  std::mutex mutex;
  std::vector<Slot> idle;  // guarded by mutex

  // Null when ICU refuses the pattern.
  std::unique_ptr<icu::SimpleDateFormat> make(const icu::Locale& locale) const {
    UErrorCode status = U_ZERO_ERROR;
    auto format = std::make_unique<icu::SimpleDateFormat>(utf16(pattern), locale, status);
    if (U_FAILURE(status)) return nullptr;
    format->setLenient(false);
    format->setBooleanAttribute(UDAT_PARSE_PARTIAL_LITERAL_MATCH, false, status);
    format->setBooleanAttribute(UDAT_PARSE_MULTIPLE_PATTERNS_FOR_MATCH, false, status);
    if (timeZoneIdentifier) {
      format->adoptTimeZone(icu::TimeZone::createTimeZone(utf16(*timeZoneIdentifier)));
    }
    return U_SUCCESS(status) ? std::move(format) : nullptr;
  }

  // A formatter for one call, set to the current default locale and time
  // zone where the formatter has none of its own.
  Slot acquire() {
    Slot slot;
    {
      std::lock_guard lock(mutex);
      if (!idle.empty()) {
        slot = std::move(idle.back());
        idle.pop_back();
      }
    }
    if (!localeIdentifier) {
      const icu::Locale& current = icu::Locale::getDefault();
      if (!slot.format || slot.localeName != current.getName()) {
        slot.format = make(current);
        slot.localeName = current.getName();
      }
    } else if (!slot.format) {
      slot.format = make(icu::Locale(localeIdentifier->c_str()));
    }
    if (slot.format && !timeZoneIdentifier) {
      std::unique_ptr<icu::TimeZone> zone(icu::TimeZone::createDefault());
      if (zone && slot.format->getTimeZone() != *zone) slot.format->adoptTimeZone(zone.release());
    }
    return slot;
  }

  void release(Slot slot) {
    if (!slot.format) return;
    std::lock_guard lock(mutex);
    if (idle.size() < kMaxIdle) idle.push_back(std::move(slot));
  }

  // Borrows a formatter for the length of one call.
  class Lease {
   public:
    explicit Lease(Impl& impl) : impl_(impl), slot_(impl.acquire()) {}
    ~Lease() { impl_.release(std::move(slot_)); }
    Lease(const Lease&) = delete;
    Lease& operator=(const Lease&) = delete;

    icu::SimpleDateFormat* get() const { return slot_.format.get(); }

   private:
    Impl& impl_;
    Slot slot_;
  };
};

DateFormatter::DateFormatter(std::string dateFormat, std::optional<std::string> localeIdentifier,
                             std::optional<std::string> timeZoneIdentifier)
    : impl_(new Impl{std::move(dateFormat),
                     std::move(localeIdentifier),
                     std::move(timeZoneIdentifier),
                     {},
                     {}}) {}

DateFormatter::~DateFormatter() = default;

const std::string& DateFormatter::dateFormat() const noexcept { return impl_->pattern; }

const std::optional<std::string>& DateFormatter::localeIdentifier() const noexcept {
  return impl_->localeIdentifier;
}

const std::optional<std::string>& DateFormatter::timeZoneIdentifier() const noexcept {
  return impl_->timeZoneIdentifier;
}

std::string DateFormatter::stringFromDate(Date date) const {
  const double millis = std::round(date.timeIntervalSince1970 * 1000.0);
  if (!std::isfinite(millis)) return {};
  const Impl::Lease lease(*impl_);
  if (!lease.get()) return {};
  // A calendar of our own carries the error of a date out of its range.
  const std::unique_ptr<icu::Calendar> calendar(lease.get()->getCalendar()->clone());
  UErrorCode status = U_ZERO_ERROR;
  calendar->setTime(millis, status);
  icu::UnicodeString text;
  lease.get()->format(*calendar, text, nullptr, status);
  if (U_FAILURE(status)) return {};
  std::string out;
  text.toUTF8String(out);
  return out;
}

std::optional<Date> DateFormatter::dateFromString(std::string_view text) const {
  if (text.size() > maxDateTextLength(impl_->pattern) || !unicode::isValidUTF8(text)) {
    return std::nullopt;
  }
  const Impl::Lease lease(*impl_);
  if (!lease.get()) return std::nullopt;
  const icu::UnicodeString utext = utf16(text);
  const std::unique_ptr<icu::Calendar> calendar(lease.get()->getCalendar()->clone());
  calendar->clear();
  icu::ParsePosition position(0);
  lease.get()->parse(utext, *calendar, position);
  if (position.getErrorIndex() >= 0 || position.getIndex() != utext.length()) return std::nullopt;
  UErrorCode status = U_ZERO_ERROR;
  // The calendar is strict: a day or month that does not exist fails here.
  const UDate millis = calendar->getTime(status);
  if (U_FAILURE(status)) return std::nullopt;
  return Date{millis / 1000.0};
}

}  // namespace kivi

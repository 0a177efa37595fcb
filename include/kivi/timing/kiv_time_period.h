// KIVTimePeriod: a duration written as a count of seconds, minutes or hours,
// for settings and time-outs that read better in their own unit, and the sum
// of several periods in seconds.
//
//   using namespace kivi;
//   double retryAfter = timeIntervalOfPeriods({Int::minutes(2), Int::seconds(30)});  // 150.0
//   double window = KIVTimePeriod::Hours(1).timeInterval();                          // 3600.0
//   timeIntervalOfPeriods({});                                                       // 0.0
//
// A period is one of three cases, each with a signed 64-bit count; counts may
// be zero or negative. KIVTimePeriod::Seconds(n), Minutes(n) and Hours(n) make
// the cases; Int::seconds(n), Int::minutes(n) and Int::hours(n) are the same
// constructors written from the count's side.
//
// A period's seconds are computed in signed 64-bit integers (n, n × 60,
// (n × 60) × 60), then converted to double. Overflow: when that product
// leaves the signed 64-bit range (Minutes beyond ±153722867280912930, Hours
// beyond ±2562047788015215) it saturates at INT64_MAX or INT64_MIN seconds,
// so timeInterval() is then ±9223372036854775808.0 (2^63). A sum is added in
// double, in list order from 0.0, and does not overflow.
//
// Thread contract: a plain value; the functions are pure and may run on any
// thread at once.
#pragma once

#include <cstdint>
#include <initializer_list>
#include <span>

#include "kivi/export.h"

namespace kivi {

class KIVI_EXPORT KIVTimePeriod {
 public:
  // The unit of the count.
  enum class Case : std::uint8_t { Seconds, Minutes, Hours };

  // A period of `count` seconds.
  static constexpr KIVTimePeriod Seconds(std::int64_t count) noexcept {
    return {Case::Seconds, count};
  }
  // A period of `count` minutes.
  static constexpr KIVTimePeriod Minutes(std::int64_t count) noexcept {
    return {Case::Minutes, count};
  }
  // A period of `count` hours.
  static constexpr KIVTimePeriod Hours(std::int64_t count) noexcept { return {Case::Hours, count}; }

  // The case and the count the period was made with.
  constexpr Case kind() const noexcept { return kind_; }
  constexpr std::int64_t count() const noexcept { return count_; }

  // The length in seconds (saturated, see above).
  double timeInterval() const noexcept;

  friend constexpr bool operator==(const KIVTimePeriod&, const KIVTimePeriod&) = default;

 private:
  constexpr KIVTimePeriod(Case kind, std::int64_t count) noexcept : kind_(kind), count_(count) {}

  Case kind_;
  std::int64_t count_;
};

// The period constructors on a count.
namespace Int {
// KIVTimePeriod::Seconds(count).
constexpr KIVTimePeriod seconds(std::int64_t count) noexcept {
  return KIVTimePeriod::Seconds(count);
}
// KIVTimePeriod::Minutes(count).
constexpr KIVTimePeriod minutes(std::int64_t count) noexcept {
  return KIVTimePeriod::Minutes(count);
}
// KIVTimePeriod::Hours(count).
constexpr KIVTimePeriod hours(std::int64_t count) noexcept { return KIVTimePeriod::Hours(count); }
}  // namespace Int

// The sum of the periods' timeInterval() values, added in order from 0.0.
KIVI_EXPORT double timeIntervalOfPeriods(std::initializer_list<KIVTimePeriod> periods) noexcept;
KIVI_EXPORT double timeIntervalOfPeriods(std::span<const KIVTimePeriod> periods) noexcept;

}  // namespace kivi

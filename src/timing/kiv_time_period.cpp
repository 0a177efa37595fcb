#include "kivi/timing/kiv_time_period.h"

#include <limits>

namespace kivi {

namespace {

// value × factor, saturated at the ends of the signed 64-bit range.
std::int64_t saturatingProduct(std::int64_t value, std::int64_t factor) noexcept {
  std::int64_t product;
  if (!__builtin_mul_overflow(value, factor, &product)) return product;
  return (value < 0) == (factor < 0) ? std::numeric_limits<std::int64_t>::max()
                                     : std::numeric_limits<std::int64_t>::min();
}

}  // namespace

double KIVTimePeriod::timeInterval() const noexcept {
  switch (kind_) {
    case Case::Seconds:
      return static_cast<double>(count_);
    case Case::Minutes:
      return static_cast<double>(saturatingProduct(count_, 60));
    case Case::Hours:
      return static_cast<double>(saturatingProduct(saturatingProduct(count_, 60), 60));
  }
  return 0;
}

double timeIntervalOfPeriods(std::span<const KIVTimePeriod> periods) noexcept {
  double total = 0.0;
  for (const auto& period : periods) total += period.timeInterval();
  return total;
}

double timeIntervalOfPeriods(std::initializer_list<KIVTimePeriod> periods) noexcept {
  return timeIntervalOfPeriods(std::span<const KIVTimePeriod>(periods.begin(), periods.size()));
}

}  // namespace kivi

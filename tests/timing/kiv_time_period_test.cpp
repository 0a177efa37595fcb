#include "kivi/timing/kiv_time_period.h"

#include <gtest/gtest.h>

#include <cmath>
#include <cstdint>
#include <limits>

namespace kivi {
namespace {

TEST(KIVTimePeriod, SumsInSeconds) {
  EXPECT_EQ(timeIntervalOfPeriods({Int::minutes(2), Int::seconds(30)}), 150.0);
  EXPECT_EQ(timeIntervalOfPeriods({}), 0.0);
  EXPECT_EQ(timeIntervalOfPeriods({Int::hours(1), Int::minutes(-30)}), 1800.0);
}

TEST(KIVTimePeriod, SecondsOutsideTheSigned64BitRangeSaturate) {
  constexpr std::int64_t kMax = std::numeric_limits<std::int64_t>::max();
  const double top = std::ldexp(1.0, 63);  // INT64_MAX and INT64_MIN as doubles
  // The last hours that fit give 9223372036854774000 s, as a double 2^63 - 2048.
  EXPECT_EQ(Int::hours(2562047788015215).timeInterval(), 9223372036854774000.0);
  EXPECT_EQ(Int::hours(-2562047788015215).timeInterval(), -9223372036854774000.0);
  EXPECT_EQ(Int::hours(2562047788015216).timeInterval(), top);
  EXPECT_EQ(Int::hours(-2562047788015216).timeInterval(), -top);
  EXPECT_EQ(Int::minutes(-153722867280912931).timeInterval(), -top);
  EXPECT_EQ(Int::minutes(kMax).timeInterval(), top);
  EXPECT_EQ(timeIntervalOfPeriods({Int::hours(kMax), Int::hours(kMax)}), 2 * top);
}

}  // namespace
}  // namespace kivi

#include "kivi/text/date_formatter.h"

#include <gtest/gtest.h>
#include <unicode/timezone.h>

#include <algorithm>
#include <atomic>
#include <cmath>
#include <memory>
#include <string>
#include <string_view>
#include <thread>
#include <vector>

#include "kivi/utils/dictionary_utils.h"

namespace kivi {
namespace {

constexpr Date kInstant{1614834367.089};  // 2021-03-04T05:06:07.089Z
constexpr const char* kText = "2021-03-04T05:06:07.089+0000";
constexpr const char* kZones[][2] = {{"UTC", "2021-03-04T05:06:07.089+0000"},
                                     {"America/St_Johns", "2021-03-04T01:36:07.089-0330"},
                                     {"Asia/Kathmandu", "2021-03-04T10:51:07.089+0545"}};

// Makes `id` the process's default ICU time zone while it lives.
class DefaultZone {
 public:
  explicit DefaultZone(const char* id) : saved_(icu::TimeZone::createDefault()) {
    icu::TimeZone::adoptDefault(icu::TimeZone::createTimeZone(id));
  }
  ~DefaultZone() { icu::TimeZone::adoptDefault(saved_.release()); }

 private:
  std::unique_ptr<icu::TimeZone> saved_;
};

// The shared formatter, made before the zones change, follows the default
// zone; one with its own locale and zone does not.
TEST(DateFormatterTest, FormatsInTheDefaultZoneUnlessGivenOneAndParsesTheOffset) {
  const auto formatter = KivUtils::utcDateFormatter();
  const DateFormatter fixed("EEEE d MMMM HH:mm", "fr_FR", "Asia/Kathmandu");
  for (const auto& [zone, local] : kZones) {
    SCOPED_TRACE(zone);
    const DefaultZone scoped(zone);
    EXPECT_EQ(formatter->dateFromString(kText), kInstant);
    EXPECT_EQ(formatter->stringFromDate(kInstant), local);
    EXPECT_EQ(formatter->dateFromString(local), kInstant);
    EXPECT_EQ(fixed.stringFromDate(kInstant), "jeudi 4 mars 10:51");
  }
}

TEST(DateFormatterTest, ParsingIsStrictAndBoundedFormattingRoundsToTheMillisecond) {
  const DateFormatter formatter("yyyy-MM-dd'T'HH:mm:ss.SSSZ", "en_US_POSIX", "UTC");
  const std::string digits = "2021" + std::string(10'000'000, '1');  // hours of work for ICU
  const std::string withNul = std::string(kText) + '\0';
  const std::string_view rejected[] = {"2021-03-04T05:06:07+0000",
                                       "2021-03-04T05:06:07.089",
                                       "2021-03-04 05:06:07.089+0000",
                                       "2021-03-04T05:06:07.089+0000 ",
                                       "2021-02-30T05:06:07.089+0000",
                                       "2021-03-04T24:06:07.089+0000",
                                       "2021-03-04T05:06:07.08\xff",
                                       "",
                                       withNul,
                                       digits};
  for (const auto& text : rejected) {
    EXPECT_EQ(formatter.dateFromString(text), std::nullopt) << text.substr(0, 40);
  }
  EXPECT_EQ(formatter.stringFromDate(Date{1614834367.0889996}), kText);
  EXPECT_EQ(formatter.stringFromDate(Date{-0.0004}), "1970-01-01T00:00:00.000+0000");
  for (double bad : {double{NAN}, double{INFINITY}, 1e300, -1e20}) {
    EXPECT_EQ(formatter.stringFromDate(Date{bad}), "") << bad;
  }
  const DateFormatter refused("yyyy-J");
  EXPECT_EQ(refused.stringFromDate(kInstant), "");
  EXPECT_EQ(refused.dateFromString("2021-J"), std::nullopt);
}

// Eight threads share the formatter while the default zone keeps changing:
// every parse still finds the one instant, every text is one of the zones'.
TEST(DateFormatterTest, SharedFormatterIsSafeFromManyThreads) {
  const DefaultZone utc("UTC");
  const auto shared = KivUtils::utcDateFormatter();
  std::atomic<int> failures{0}, running{8};
  std::vector<std::thread> threads;
  for (int t = 0; t < 8; ++t) {
    threads.emplace_back([&] {
      for (int i = 0; i < 200; ++i) {
        const auto formatter = KivUtils::utcDateFormatter();
        const std::string text = formatter->stringFromDate(kInstant);
        const bool known = std::any_of(std::begin(kZones), std::end(kZones),
                                       [&](const auto& zone) { return text == zone[1]; });
        if (formatter != shared || !known || formatter->dateFromString(text) != kInstant) {
          ++failures;
        }
      }
      --running;
    });
  }
  for (int i = 0; running > 0; ++i) const DefaultZone zone(kZones[i % 3][0]);
  for (auto& thread : threads) thread.join();
  EXPECT_EQ(failures, 0);
}

}  // namespace
}  // namespace kivi

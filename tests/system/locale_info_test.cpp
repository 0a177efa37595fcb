#include "kivi/system/locale_info.h"

#include <gtest/gtest.h>

#include <cstdlib>
#include <optional>
#include <string>

#include "fake_root.h"

namespace kivi {
namespace {

// Sets TZ (or unsets it, for nullopt) for the test's lifetime.
class ScopedTZ {
 public:
  explicit ScopedTZ(const std::optional<std::string>& value) {
    if (const char* old = std::getenv("TZ")) old_ = old;
    if (value) {
      ::setenv("TZ", value->c_str(), 1);
    } else {
      ::unsetenv("TZ");
    }
  }
  ~ScopedTZ() {
    if (old_) {
      ::setenv("TZ", old_->c_str(), 1);
    } else {
      ::unsetenv("TZ");
    }
  }

 private:
  std::optional<std::string> old_;
};

TEST(TimeZone, LocalZoneComesFromTZThenTheLocaltimeLinkThenTheTimezoneFile) {
  testing::FakeRoot root;
  for (const char* zone : {"Europe/Paris", "America/New_York", "Europe/London"}) {
    root.write(std::string("/usr/share/zoneinfo/") + zone, "TZif");
  }
  root.link("/etc/localtime", "../usr/share/zoneinfo/posix/America/New_York");
  root.write("/etc/timezone", "Europe/London\n");

  struct Case {
    std::optional<std::string> tz;
    std::string expected;
  };
  const Case cases[] = {
      {"Europe/Paris", "Europe/Paris"},
      {":Europe/Paris", "Europe/Paris"},
      {"/usr/share/zoneinfo/Europe/Paris", "Europe/Paris"},
      {"", "UTC"},
      {"GMT", "GMT"},
      // A POSIX rule and a name the zoneinfo directory lacks say nothing of
      // the zone: the link decides.
      {"CET-1CEST", "America/New_York"},
      {"Europe/Atlantis", "America/New_York"},
      {"../../etc/passwd", "America/New_York"},
      {std::nullopt, "America/New_York"},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.tz ? *c.tz : "(unset)");
    ScopedTZ tz(c.tz);
    EXPECT_EQ(TimeZone::localTimeZone()->name(), c.expected);
  }

  ScopedTZ unset(std::nullopt);
  root.remove("/etc/localtime");
  EXPECT_EQ(TimeZone::localTimeZone()->name(), "Europe/London");
  root.write("/etc/timezone", "not a zone!\n");
  EXPECT_EQ(TimeZone::localTimeZone()->name(), "UTC");
}

TEST(TimeZone, NamedZonesExistOnlyWhenTheZoneinfoDirectoryHoldsThem) {
  testing::FakeRoot root;
  root.write("/usr/share/zoneinfo/Europe/Paris", "TZif");
  ASSERT_NE(TimeZone::timeZoneWithName("Europe/Paris"), nullptr);
  EXPECT_EQ(TimeZone::timeZoneWithName("Europe/Paris")->name(), "Europe/Paris");
  EXPECT_NE(TimeZone::timeZoneWithName("GMT"), nullptr);
  EXPECT_EQ(TimeZone::timeZoneWithName("europe/paris"), nullptr);
  EXPECT_EQ(TimeZone::timeZoneWithName("Europe"), nullptr);  // a directory
  EXPECT_EQ(TimeZone::timeZoneWithName(""), nullptr);
  EXPECT_EQ(TimeZone::timeZoneWithName(std::string(10000, 'A')), nullptr);
}

TEST(Locale, RegionIsTheCountryOfTheLocaleAndAbsentForThePOSIXLocale) {
  EXPECT_EQ(Locale::localeWithLocaleIdentifier("de_DE")->countryCode(), "DE");
  EXPECT_EQ(Locale::localeWithLocaleIdentifier("sr_Latn_RS")->countryCode(), "RS");
  EXPECT_EQ(Locale::localeWithLocaleIdentifier("fr")->countryCode(), std::nullopt);
  EXPECT_EQ(Locale::localeWithLocaleIdentifier("en_US_POSIX")->countryCode(), std::nullopt);
  EXPECT_EQ(Locale::localeWithLocaleIdentifier("")->countryCode(), std::nullopt);
}

}  // namespace
}  // namespace kivi

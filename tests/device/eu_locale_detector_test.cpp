#include "kivi/device/eu_locale_detector.h"

#include <gtest/gtest.h>

#include <cstdio>
#include <cstdlib>
#include <string>

#include "fake_root.h"
#include "kivi/system/locale_info.h"

namespace kivi {
namespace {

TEST(EULocaleDetector, RegionCodesMatchAfterUpperCasingWithoutTrimming) {
  for (const char* code : {"DE", "de", "gb", "Ch", "IM", "is", "GI"}) {
    EXPECT_TRUE(EULocaleDetector::isEUCountryCode(std::string(code))) << code;
  }
  for (const char* code : {"US", " DE", "DE ", "D", "DEU", "", "UK", "EU", "d\xc3\xa9", "\xff"}) {
    EXPECT_FALSE(EULocaleDetector::isEUCountryCode(std::string(code))) << code;
  }
  EXPECT_FALSE(EULocaleDetector::isEUCountryCode(std::nullopt));
}

TEST(EULocaleDetector, TimeZonesMatchByExactName) {
  auto zone = [](const char* name) { return std::make_shared<const TimeZone>(name); };
  EXPECT_TRUE(EULocaleDetector::isEUTimeZone(zone("Europe/Paris")));
  EXPECT_TRUE(EULocaleDetector::isEUTimeZone(zone("GMT")));
  EXPECT_TRUE(EULocaleDetector::isEUTimeZone(zone("Europe/Isle_of_Man")));
  EXPECT_FALSE(EULocaleDetector::isEUTimeZone(zone("Europe/London")));
  EXPECT_FALSE(EULocaleDetector::isEUTimeZone(zone("europe/paris")));
  EXPECT_FALSE(EULocaleDetector::isEUTimeZone(zone("UTC")));
  EXPECT_FALSE(EULocaleDetector::isEUTimeZone(nullptr));
}

// Run by the test below in a child process whose environment holds the
// locale and the zone; prints the decision.
TEST(EULocaleDetectorChild, PrintDecision) {
  const char* root = std::getenv("KIVI_EU_CHILD_ROOT");
  if (!root) GTEST_SKIP() << "runs only as a child of DecidesFromTheEnvironmentOfAProcess";
  system::setRoot(root);
  auto detector = EULocaleDetector::createEULocaleDetector();
  const bool decision = detector->doesDeviceAppearToBeLocatedInEU();
  const bool same =
      decision == EULocaleDetector::doesDeviceAppearToBeLocatedInEUBasedOnLocaleAndTimeZone();
  std::printf("\nEU=%d same=%d\n", decision ? 1 : 0, same ? 1 : 0);
}

TEST(EULocaleDetector, DecidesFromTheEnvironmentOfAProcess) {
  testing::FakeRoot root;
  for (const char* zone : {"Europe/Paris", "America/New_York", "Europe/London"}) {
    root.write(std::string("/usr/share/zoneinfo/") + zone, "TZif");
  }
  const std::string rootDirectory = root.directory();
  system::setRoot("");  // the children read it; this process does not need to

  struct Case {
    const char* lang;
    const char* tz;
    bool eu;
  };
  const Case cases[] = {
      {"de_DE.UTF-8", "America/New_York", true},  // the region decides, the zone is not read
      {"en_US.UTF-8", "Europe/Paris", true},
      {"en_US.UTF-8", "GMT", true},
      {"en_US.UTF-8", "Europe/London", false},
      {"en_GB.UTF-8", "America/New_York", true},
      {"C", "America/New_York", false},  // no region
      {"C", "Europe/Paris", true},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(std::string(c.lang) + " " + c.tz);
    const std::string command =
        "env -u LC_ALL -u LC_MESSAGES -u LANGUAGE LANG=" + std::string(c.lang) + " TZ=" + c.tz +
        " KIVI_EU_CHILD_ROOT=" + rootDirectory + " /proc/" + std::to_string(::getpid()) + "/exe" +
        " --gtest_filter=EULocaleDetectorChild.PrintDecision 2>&1";
    FILE* child = ::popen(command.c_str(), "r");
    ASSERT_NE(child, nullptr);
    std::string output;
    char buffer[512];
    while (std::fgets(buffer, sizeof buffer, child)) output += buffer;
    EXPECT_EQ(::pclose(child), 0) << output;
    EXPECT_NE(output.find(std::string("EU=") + (c.eu ? "1" : "0") + " same=1"), std::string::npos)
        << output;
  }
}

}  // namespace
}  // namespace kivi

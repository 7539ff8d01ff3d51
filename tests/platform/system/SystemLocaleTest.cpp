#include "platform/system/SystemLocale.h"

#include <gtest/gtest.h>
#include <stdlib.h>

#include "tests/platform/system/Expect.h"
#include "tests/support/MemoryUserDefaults.h"
#include "tests/support/RecordingLog.h"

namespace telvane {
namespace {

using telvane::testing::RecordingLog;
using telvane::testing::succeeds;
using telvane::testing::textOf;

class SystemLocaleTest : public ::testing::Test {
 protected:
  std::string country(const Environment& environment) {
    return textOf(SystemLocale(environment, _defaults, _log).countryCode());
  }
  // The offset in a zone given in the form of the variable TZ.
  std::chrono::seconds offset(const char* zone, double seconds) {
    ::setenv("TZ", zone, 1);
    const std::chrono::seconds result =
        SystemLocale({}, _defaults, _log).secondsFromGMT(Date::fromSecondsSince1970(seconds));
    ::unsetenv("TZ");
    return result;
  }

  testing::MemoryUserDefaults _defaults;
  RecordingLog _log;
};

TEST_F(SystemLocaleTest, takesTheRegionOfTheLocale) {
  EXPECT_EQ(country({.localeAll = "en_US.UTF-8"}), "US");
  EXPECT_EQ(country({.localeAll = "de_AT@euro"}), "AT");
  EXPECT_EQ(country({.localeDefault = "fr_CH"}), "CH");
  EXPECT_EQ(country({.localeDefault = "es_419.UTF-8"}), "419");
}

TEST_F(SystemLocaleTest, prefersTheVariableForAllCategories) {
  EXPECT_EQ(country({.localeAll = "en_GB.UTF-8", .localeDefault = "en_US.UTF-8"}), "GB");
  EXPECT_EQ(country({.localeAll = "C", .localeDefault = "en_US.UTF-8"}), "(none)");
}

TEST_F(SystemLocaleTest, hasNoCountryWithoutARegion) {
  for (const char* locale : {"C", "POSIX", "C.UTF-8", "en", "en_", "en_.UTF-8", "en_usa", "en_US_X", "_", "en_../x"}) {
    EXPECT_EQ(country({.localeDefault = locale}), "(none)") << locale;
  }
  EXPECT_EQ(country({}), "(none)");
}

TEST_F(SystemLocaleTest, letsTheSettingOverrideAndReadsItAnew) {
  const SystemLocale locale({.localeAll = "en_US.UTF-8"}, _defaults, _log);
  EXPECT_EQ(textOf(locale.countryCode()), "US");
  ASSERT_TRUE(succeeds(_defaults.setObject("com.corvex.locale", "Country", "NZ")));
  EXPECT_EQ(textOf(locale.countryCode()), "NZ");
}

TEST_F(SystemLocaleTest, countsASettingOfAWrongTypeAsAbsentWithOneErrorLine) {
  ASSERT_TRUE(succeeds(_defaults.setObject("com.corvex.locale", "Country", 5)));
  _log.expectError("Country in the suite com.corvex.locale");
  const SystemLocale locale({.localeAll = "en_US.UTF-8"}, _defaults, _log);
  EXPECT_EQ(textOf(locale.countryCode()), "US");
  EXPECT_EQ(textOf(locale.countryCode()), "US");
  EXPECT_EQ(_log.count(LogLevel::Error, ""), 1u);
}

TEST_F(SystemLocaleTest, tellsTheOffsetOfTheZoneAtTheGivenDate) {
  constexpr double kWinter = 1704067200;  // 2024-01-01
  constexpr double kSummer = 1719792000;  // 2024-07-01
  EXPECT_EQ(offset("UTC0", kWinter).count(), 0);
  EXPECT_EQ(offset("XXX-5:30", kWinter).count(), 19800);
  EXPECT_EQ(offset("EST5EDT,M3.2.0,M11.1.0", kWinter).count(), -18000);
  EXPECT_EQ(offset("EST5EDT,M3.2.0,M11.1.0", kSummer).count(), -14400);
}

}  // namespace
}  // namespace telvane

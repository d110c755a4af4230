#include "platform/system/SystemLocale.h"

#include <gtest/gtest.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstdlib>
#include <map>
#include <string>

namespace tallyd::platform {
namespace {

using namespace std::chrono_literals;
using Environment = std::map<std::string, std::string>;

/// The country code in a process that starts with this environment: ICU reads it only once, so each runs in a
/// child.
std::string countryCodeIn(const Environment& environment) {
  int ends[2];
  EXPECT_EQ(::pipe(ends), 0);
  const pid_t child = ::fork();
  if (child == 0) {
    for (const char* name : {"LC_ALL", "LC_MESSAGES", "LANG"}) ::unsetenv(name);
    for (const auto& [name, value] : environment) ::setenv(name.c_str(), value.c_str(), 1);
    const std::string code = SystemLocale().countryCode().value_or("none");
    ::_exit(::write(ends[1], code.data(), code.size()) == static_cast<ssize_t>(code.size()) ? 0 : 1);
  }
  ::close(ends[1]);
  char answer[32];
  const ssize_t length = ::read(ends[0], answer, sizeof answer);
  ::close(ends[0]);
  int status = -1;
  EXPECT_EQ(::waitpid(child, &status, 0), child);
  EXPECT_EQ(status, 0);
  return length > 0 ? std::string(answer, static_cast<std::size_t>(length)) : "";
}

TEST(SystemLocaleTest, TakesTheCountryFromLANG) {
  EXPECT_EQ(countryCodeIn({{"LANG", "de_DE.UTF-8"}}), "DE");
  EXPECT_EQ(countryCodeIn({{"LANG", "zh_Hant_TW.UTF-8"}}), "TW");
  EXPECT_EQ(countryCodeIn({{"LANG", "de_AT@euro"}}), "AT");
}

TEST(SystemLocaleTest, LC_ALLComesBeforeLC_MESSAGESBeforeLANG) {
  EXPECT_EQ(countryCodeIn({{"LC_ALL", "fr_CA"}, {"LC_MESSAGES", "de_DE"}, {"LANG", "it_IT"}}), "CA");
  EXPECT_EQ(countryCodeIn({{"LC_MESSAGES", "de_DE"}, {"LANG", "it_IT"}}), "DE");
}

TEST(SystemLocaleTest, ABareLanguageNamesNoCountry) { EXPECT_EQ(countryCodeIn({{"LANG", "de"}}), "none"); }

TEST(SystemLocaleTest, TheCLocaleIsAmerican) {
  EXPECT_EQ(countryCodeIn({}), "US");
  EXPECT_EQ(countryCodeIn({{"LANG", "C.UTF-8"}}), "US");
  EXPECT_EQ(countryCodeIn({{"LC_ALL", "POSIX"}}), "US");
}

class SystemLocaleZoneTest : public testing::Test {
 protected:
  void SetUp() override {
    if (const char* zone = std::getenv("TZ")) _before = zone;
  }
  void TearDown() override {
    if (_before) {
      ::setenv("TZ", _before->c_str(), 1);
    } else {
      ::unsetenv("TZ");
    }
    ::tzset();
  }

 private:
  std::optional<std::string> _before;
};

// Both in 2023: the middle of January and the middle of July.
const TimePoint kWinter{std::chrono::seconds(1'673'784'000)};
const TimePoint kSummer{std::chrono::seconds(1'689'422'400)};

TEST_F(SystemLocaleZoneTest, GivesTheOffsetThatHoldsAtTheTime) {
  const SystemLocale locale;
  ::setenv("TZ", "CET-1CEST,M3.5.0,M10.5.0/3", 1);
  EXPECT_EQ(locale.offsetFromGMT(kWinter), 1h);
  EXPECT_EQ(locale.offsetFromGMT(kSummer), 2h);
}

TEST_F(SystemLocaleZoneTest, IsNegativeWestOfGreenwich) {
  const SystemLocale locale;
  ::setenv("TZ", "NST3:30", 1);
  EXPECT_EQ(locale.offsetFromGMT(kWinter), -(3h + 30min));
}

TEST_F(SystemLocaleZoneTest, FollowsAChangeOfZone) {
  const SystemLocale locale;
  ::setenv("TZ", "UTC0", 1);
  EXPECT_EQ(locale.offsetFromGMT(kWinter), 0s);
  ::setenv("TZ", "IST-5:30", 1);
  EXPECT_EQ(locale.offsetFromGMT(kWinter), 5h + 30min);
}

TEST_F(SystemLocaleZoneTest, CountsFractionsBefore1970Downwards) {
  const SystemLocale locale;
  ::setenv("TZ", "JST-9", 1);
  EXPECT_EQ(locale.offsetFromGMT(TimePoint(-1ms)), 9h);
}

}  // namespace
}  // namespace tallyd::platform

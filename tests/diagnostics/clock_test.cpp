#include "diagnostics/clock.h"

#include <cstdint>
#include <cstdlib>
#include <ctime>

#include <gtest/gtest.h>

namespace {

using TessikSDK::Diagnostics::ClockAnchor;
using TessikSDK::Diagnostics::getTimeOfDay;
using TessikSDK::Diagnostics::timeFromCounter;
using TessikSDK::Diagnostics::TimeVal;

constexpr std::int64_t kNano = 1000000000;
// Ten years of nanoseconds: delta x 1000000 would overflow 64 bits, the ticks within the second do not.
constexpr std::int64_t kTenYears = 315360000LL * kNano + 999999999;

TEST(ClockArithmetic, MatchesHandComputedTimeAndCarriesOnce) {
  const struct {
    const char* name;
    ClockAnchor anchor;  // seconds, microseconds, counter, frequency
    std::int64_t ticksSinceAnchor;
    TimeVal expected;
  } cases[] = {
      {"1/3 s truncates", {10, 0, 5, 3}, 1, {10, 333333}},
      {"just below carry", {10, 333333, 5, 3}, 8, {12, 999999}},
      {"exact carry", {10, 333334, 5, 3}, 8, {13, 0}},
      {"seconds, no carry", {1700000000, 999000, 123456789, kNano}, 5000001000LL, {1700000005, 999001}},
      {"seconds and carry", {1700000000, 999000, 123456789, kNano}, 7500000000LL, {1700000008, 499000}},
      {"10 MHz truncates", {0, 0, 77, 10000000}, 12345678, {1, 234567}},
      {"10 years", {1700000000, 0, 1000, kNano}, kTenYears, {2015360000, 999999}},
      {"10 years, carry", {1700000000, 1, 1000, kNano}, kTenYears, {2015360001, 0}}};
  for (const auto& c : cases) {
    const TimeVal tv = timeFromCounter(c.anchor, c.anchor.baseCounter + c.ticksSinceAnchor);
    EXPECT_EQ(tv.seconds, c.expected.seconds) << c.name;
    EXPECT_EQ(tv.microseconds, c.expected.microseconds) << c.name;
  }
}

std::int64_t toMicroseconds(const TimeVal& tv) {
  return std::int64_t{tv.seconds} * 1000000 + tv.microseconds;
}

TEST(ClockTimeOfDay, FollowsWallClockAndNeverGoesBack) {
  TimeVal previous{};
  ASSERT_EQ(getTimeOfDay(&previous), 0);
  // The anchor is the system wall clock, so the result sits near time(); a margin covers a slow machine.
  EXPECT_LE(std::llabs(std::int64_t{previous.seconds} - static_cast<std::int64_t>(std::time(nullptr))), 2);
  for (int i = 0; i < 10000; ++i) {
    TimeVal now{};
    ASSERT_EQ(getTimeOfDay(&now), 0);
    ASSERT_TRUE(now.microseconds >= 0 && now.microseconds < 1000000) << now.microseconds;
    ASSERT_GE(toMicroseconds(now), toMicroseconds(previous)) << "call " << i;
    previous = now;
  }
}

}  // namespace

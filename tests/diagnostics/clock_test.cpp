#include "diagnostics/clock.h"

#include <cstdint>
#include <cstdlib>
#include <ctime>
#include <ostream>
#include <string>

#include <gtest/gtest.h>

namespace {

using TessikSDK::Diagnostics::ClockAnchor;
using TessikSDK::Diagnostics::getTimeOfDay;
using TessikSDK::Diagnostics::timeFromCounter;
using TessikSDK::Diagnostics::TimeVal;

constexpr std::int64_t kNanoTicks = 1000000000;

struct CounterCase {
  const char* name;
  ClockAnchor anchor;
  std::int64_t ticksSinceAnchor;
  TimeVal expected;
};

void PrintTo(const CounterCase& c, std::ostream* os) { *os << c.name; }

class ClockArithmetic : public ::testing::TestWithParam<CounterCase> {};

TEST_P(ClockArithmetic, MatchesHandComputedTime) {
  const CounterCase& c = GetParam();
  const TimeVal tv = timeFromCounter(c.anchor, c.anchor.baseCounter + c.ticksSinceAnchor);
  EXPECT_EQ(tv.seconds, c.expected.seconds);
  EXPECT_EQ(tv.microseconds, c.expected.microseconds);
}

// Ten years of nanoseconds: delta x 1000000 would overflow 64 bits, the ticks within the second do not.
constexpr std::int64_t kTenYearsOfNanoseconds = 315360000LL * kNanoTicks + 999999999;

INSTANTIATE_TEST_SUITE_P(
    Diagnostics,
    ClockArithmetic,
    ::testing::Values(CounterCase{"same_instant", {100, 123000, 42, kNanoTicks}, 0, {100, 123000}},
                      CounterCase{"third_of_a_second_truncates", {10, 0, 5, 3}, 1, {10, 333333}},
                      CounterCase{"sum_just_below_carry", {10, 333333, 5, 3}, 8, {12, 999999}},
                      CounterCase{"sum_exactly_carries", {10, 333334, 5, 3}, 8, {13, 0}},
                      CounterCase{"nanosecond_sum_exactly_carries",
                                  {1700000000, 250000, 5 * kNanoTicks, kNanoTicks},
                                  2750000000LL,
                                  {1700000003, 0}},
                      CounterCase{"several_seconds_no_carry",
                                  {1700000000, 999000, 123456789, kNanoTicks},
                                  5000001000LL,
                                  {1700000005, 999001}},
                      CounterCase{"several_seconds_with_carry",
                                  {1700000000, 999000, 123456789, kNanoTicks},
                                  7500000000LL,
                                  {1700000008, 499000}},
                      CounterCase{"ten_megahertz_truncates", {0, 0, 77, 10000000}, 12345678, {1, 234567}},
                      CounterCase{"large_delta_without_overflow",
                                  {1700000000, 0, 1000, kNanoTicks},
                                  kTenYearsOfNanoseconds,
                                  {2015360000, 999999}},
                      CounterCase{"large_delta_then_carry",
                                  {1700000000, 1, 1000, kNanoTicks},
                                  kTenYearsOfNanoseconds,
                                  {2015360001, 0}}),
    [](const ::testing::TestParamInfo<CounterCase>& info) { return std::string(info.param.name); });

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
    ASSERT_GE(now.microseconds, 0);
    ASSERT_LT(now.microseconds, 1000000);
    ASSERT_GE(toMicroseconds(now), toMicroseconds(previous)) << "call " << i;
    previous = now;
  }
}

}  // namespace

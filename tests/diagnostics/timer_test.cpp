#include "diagnostics/timer.h"

#include <cstdint>

#include <gtest/gtest.h>

namespace {

using TessikSDK::Diagnostics::Microseconds;
using TessikSDK::Diagnostics::Milliseconds;
using TessikSDK::Diagnostics::Seconds;
using TessikSDK::Diagnostics::Timer;
using TessikSDK::Diagnostics::TimeVal;

std::int64_t toMicroseconds(const TimeVal& tv) {
  return std::int64_t{tv.seconds} * 1000000 + tv.microseconds;
}

// Spins (no sleeping, no timing assertions) until the timer has seen at least `micros` microseconds.
void waitUntilElapsed(const Timer& timer, double micros) {
  for (long i = 0; i < 200000000L && timer.elapsed(Microseconds) < micros; ++i) {
  }
  ASSERT_GE(timer.elapsed(Microseconds), micros) << "clock did not advance";
}

class TimerTest : public ::testing::Test {
 protected:
  void SetUp() override { ASSERT_NO_FATAL_FAILURE(waitUntilElapsed(original, 2)); }
  Timer original;
};

TEST_F(TimerTest, CopyOwnsSeparateStartWithSameValue) {
  const Timer copy(original);
  EXPECT_NE(&copy.startTime(), &original.startTime());
  EXPECT_EQ(toMicroseconds(copy.startTime()), toMicroseconds(original.startTime()));
  // Sampled after the original, from the same start, so never less.
  const double originalElapsed = original.elapsed(Microseconds);
  EXPECT_GE(copy.elapsed(Microseconds), originalElapsed);
}

TEST_F(TimerTest, AssignmentCopiesStartAndRestartsStayIndependent) {
  Timer later;
  ASSERT_NO_FATAL_FAILURE(waitUntilElapsed(later, 2));
  ASSERT_GT(toMicroseconds(later.startTime()), toMicroseconds(original.startTime()));

  later = original;
  EXPECT_EQ(toMicroseconds(later.startTime()), toMicroseconds(original.startTime()));
  EXPECT_NE(&later.startTime(), &original.startTime());

  const std::int64_t originalStart = toMicroseconds(original.startTime());
  later.restart();
  EXPECT_GT(toMicroseconds(later.startTime()), originalStart);
  EXPECT_EQ(toMicroseconds(original.startTime()), originalStart);
}

TEST_F(TimerTest, RestartMovesStartForward) {
  const std::int64_t before = toMicroseconds(original.startTime());
  original.restart();
  EXPECT_GT(toMicroseconds(original.startTime()), before);
}

// Read in order seconds, microseconds, milliseconds, seconds: each is a later sample of the same
// interval, so in common units the values can only grow. A swapped scale breaks the chain by 1e3 or more.
TEST_F(TimerTest, UnitsScaleMicroseconds) {
  ASSERT_NO_FATAL_FAILURE(waitUntilElapsed(original, 1000));
  const double s = original.elapsed(Seconds);
  const double us = original.elapsed(Microseconds);
  const double ms = original.elapsed(Milliseconds);
  const double s2 = original.elapsed(Seconds);
  const double slack = 1e-6;  // the scales are not exact binary fractions
  EXPECT_GE(s, 1000 * 1e-6 - slack);
  EXPECT_LE(s * 1e6, us + slack);
  EXPECT_LE(us * 1e-3, ms + slack);
  EXPECT_LE(ms * 1e-3, s2 + slack);
}

TEST_F(TimerTest, UnknownUnitYieldsZero) {
  for (int unit : {-1, 3, 1000}) EXPECT_EQ(original.elapsed(unit), 0.0) << "unit " << unit;
}

}  // namespace

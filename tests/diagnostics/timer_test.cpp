#include "diagnostics/timer.h"

#include <cstdint>

#include <gtest/gtest.h>

namespace {

using TessikSDK::Diagnostics::Microseconds;
using TessikSDK::Diagnostics::Milliseconds;
using TessikSDK::Diagnostics::Seconds;
using TessikSDK::Diagnostics::Timer;

std::int64_t startOf(const Timer& timer) {
  return std::int64_t{timer.startTime().seconds} * 1000000 + timer.startTime().microseconds;
}

// Spins (no sleeping, no timing assertions) until the timer has seen at least `micros` microseconds.
void waitUntilElapsed(const Timer& timer, double micros) {
  for (long i = 0; i < 200000000L && timer.elapsed(Microseconds) < micros; ++i) {
  }
  ASSERT_GE(timer.elapsed(Microseconds), micros) << "clock did not advance";
}

TEST(Timer, CopiesKeepTheStartAndRestartIndependently) {
  Timer original;
  ASSERT_NO_FATAL_FAILURE(waitUntilElapsed(original, 2));
  const Timer copy(original);
  Timer assigned;
  ASSERT_GT(startOf(assigned), startOf(original));
  assigned = original;
  const std::int64_t start = startOf(original);
  EXPECT_EQ(startOf(copy), start);
  EXPECT_EQ(startOf(assigned), start);
  assigned.restart();
  EXPECT_GT(startOf(assigned), start);
  original.restart();
  EXPECT_GT(startOf(original), start);
  EXPECT_EQ(startOf(copy), start);
}

// Read in order seconds, microseconds, milliseconds, seconds: each is a later sample of the same
// interval, so in common units the values can only grow. A swapped scale breaks the chain by 1e3 or more.
TEST(Timer, UnitsScaleMicrosecondsAndUnknownUnitsYieldZero) {
  Timer timer;
  ASSERT_NO_FATAL_FAILURE(waitUntilElapsed(timer, 1000));
  const double s = timer.elapsed(Seconds), us = timer.elapsed(Microseconds);
  const double ms = timer.elapsed(Milliseconds), s2 = timer.elapsed(Seconds);
  const double slack = 1e-6;  // the scales are not exact binary fractions
  EXPECT_GE(s, 1000 * 1e-6 - slack);
  EXPECT_LE(s * 1e6, us + slack);
  EXPECT_LE(us * 1e-3, ms + slack);
  EXPECT_LE(ms * 1e-3, s2 + slack);
  for (int unit : {-1, 3, 1000}) EXPECT_EQ(timer.elapsed(unit), 0.0) << "unit " << unit;
}

}  // namespace

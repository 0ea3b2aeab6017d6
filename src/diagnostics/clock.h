#pragma once

#include <cstdint>

namespace TessikSDK::Diagnostics {

/// A point in wall-clock time. microseconds is always in [0, 999999].
struct TimeVal {
  std::int32_t seconds;
  std::int32_t microseconds;
};

/// The wall-clock time and counter reading captured together at the clock's first use; every later
/// time is this wall time plus the counter ticks since.
struct ClockAnchor {
  std::int32_t baseSeconds;
  std::int32_t baseMicroseconds;  ///< [0, 999999]
  std::int64_t baseCounter;
  std::int64_t frequency;  ///< counter ticks per second, > 0 and at most 9.2e12 (see timeFromCounter)
};

/// Fills *tv with the current wall-clock time at the counter's resolution (microseconds).
///
/// The wall-clock offset is captured once, on the first call in the process, and the clock then only
/// advances with a monotonic counter: it never follows later changes of the system clock, so successive
/// results never decrease. If the counter cannot be read on that first call, a message goes to the
/// standard error stream and the process exits with status 1.
/// @pre tv is not null.
/// @return 0, or -1 when the counter cannot be read; *tv is then left unchanged.
/// Not thread-safe: the first call must not race another.
int getTimeOfDay(TimeVal* tv);

/// The time at which the counter reads `counter`, given the anchor; exact integer arithmetic, truncating
/// partial microseconds. Used by getTimeOfDay, declared here so the arithmetic can be checked with
/// chosen anchors. The intermediate (ticks within the second) x 1000000 must fit in 64 bits, which
/// bounds the frequency, not the time since the anchor.
TimeVal timeFromCounter(const ClockAnchor& anchor, std::int64_t counter);

}  // namespace TessikSDK::Diagnostics

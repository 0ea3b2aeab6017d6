#include "diagnostics/clock.h"

#include <cstdlib>
#include <ctime>
#include <iostream>

namespace TessikSDK::Diagnostics {

namespace {

// Platform layer: a monotonic tick counter with its frequency, and the system wall clock. The clock
// arithmetic above it only sees ticks and a wall-clock anchor.

constexpr std::int64_t kNanosecondsPerSecond = 1000000000;

bool readCounterFrequency(std::int64_t* ticksPerSecond) {
  *ticksPerSecond = kNanosecondsPerSecond;
  return true;
}

bool readCounter(std::int64_t* ticks) {
  timespec now{};
  if (clock_gettime(CLOCK_MONOTONIC, &now) != 0) return false;
  *ticks = static_cast<std::int64_t>(now.tv_sec) * kNanosecondsPerSecond + now.tv_nsec;
  return true;
}

// Truncated to whole milliseconds first: the anchor has always had millisecond resolution, and the
// counter supplies everything finer.
void readWallClock(std::int32_t* seconds, std::int32_t* microseconds) {
  timespec now{};
  clock_gettime(CLOCK_REALTIME, &now);
  *seconds = static_cast<std::int32_t>(now.tv_sec);
  *microseconds = static_cast<std::int32_t>(now.tv_nsec / 1000000) * 1000;
}

constexpr std::uint32_t kAnchorUnset = 0xFFFFFFFFu;

std::uint32_t anchorState = kAnchorUnset;
ClockAnchor processAnchor{};

}  // namespace

TimeVal timeFromCounter(const ClockAnchor& anchor, std::int64_t counter) {
  const std::int64_t delta = counter - anchor.baseCounter;
  TimeVal tv;
  tv.seconds = static_cast<std::int32_t>(anchor.baseSeconds + delta / anchor.frequency);
  // Only the ticks within the last second are scaled, so the product stays small however long the
  // process has run.
  tv.microseconds = static_cast<std::int32_t>(anchor.baseMicroseconds +
                                              (delta % anchor.frequency) * 1000000 / anchor.frequency);
  // Both terms are below one second, so one carry is always enough.
  if (tv.microseconds >= 1000000) {
    tv.seconds += 1;
    tv.microseconds -= 1000000;
  }
  return tv;
}

int getTimeOfDay(TimeVal* tv) {
  if (anchorState == kAnchorUnset) {
    readWallClock(&processAnchor.baseSeconds, &processAnchor.baseMicroseconds);
    // A clock that cannot measure anything is not worth running on; the wording matches every other
    // build of the library so the message means the same in any log.
    if (!readCounterFrequency(&processAnchor.frequency)) {
      std::cerr << "QueryPerformanceFrequency(): No high-reso counter.\n";
      std::exit(1);
    }
    if (!readCounter(&processAnchor.baseCounter)) {
      std::cerr << "QueryPerformanceCounter(): No high-reso counter.\n";
      std::exit(1);
    }
    anchorState = 0;
  }
  std::int64_t counter = 0;
  if (!readCounter(&counter)) return -1;
  *tv = timeFromCounter(processAnchor, counter);
  return 0;
}

}  // namespace TessikSDK::Diagnostics

#pragma once

#include <memory>

#include "diagnostics/clock.h"

namespace TessikSDK::Diagnostics {

/// Index into Timer::elapsed's scale table.
enum TimeUnit { Seconds = 0, Milliseconds = 1, Microseconds = 2 };

/// Measures wall-clock time since its start, on getTimeOfDay.
///
/// Each Timer owns its own start time on the heap; a copy gets a fresh one holding the same value, so
/// the copy measures from the original's start but restarting either leaves the other alone. There is no
/// move: moving copies, so a Timer never lacks a start.
class Timer {
 public:
  /// Starts now.
  Timer();
  Timer(const Timer& other);
  Timer& operator=(const Timer& other);
  ~Timer();

  /// Start = now. If the clock cannot be read, the previous start is kept.
  void restart();

  /// Time since the start in `unit` (a TimeUnit), at microsecond resolution. Any other unit yields 0.0:
  /// there is no scale for it, and a zero duration is easier to spot than a misscaled one.
  double elapsed(int unit) const;

  /// The start time, for inspection.
  const TimeVal& startTime() const { return *start_; }

 private:
  std::unique_ptr<TimeVal> start_;
};

}  // namespace TessikSDK::Diagnostics

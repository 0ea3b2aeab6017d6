#pragma once

#include <cstdint>
#include <iosfwd>
#include <string>
#include <vector>

#include "diagnostics/timer.h"

namespace TessikSDK::Diagnostics {

/// One named stage. A label that starts with a space marks a sub-stage of the stage before it.
struct TimingRecord {
  std::string label;
  double seconds = 0.0;  ///< 0.0 until the stage is stopped
  Timer timer;
};

/// Collects named stage timings of one run, in start order.
///
/// Not thread-safe: use it from one thread. The process has a single shared instance (stageProfiler()),
/// so only one geodesic binding may run at a time.
class StageProfiler {
 public:
  /// Drops every record; the timings of the last run stay available until this is called.
  void reset();

  /// Appends a record {label, 0.0, timer started now}.
  /// @return the new record's index, to pass to stopTimer.
  int startTimer(const std::string& label);

  /// Sets the record's seconds to its timer's elapsed time. An index past the records is ignored.
  /// @return *this, for chaining.
  StageProfiler& stopTimer(std::uint32_t index);

  const std::vector<TimingRecord>& records() const { return records_; }

 private:
  std::vector<TimingRecord> records_;
};

/// Writes one line per record and then the total, without a final end of line:
///
///     <label padded to W + 3>[\t if the label starts with a space]<seconds>
///     ...
///     Total (s)<padding><total>
///
/// W is the longest label, at least 9 (the length of "Total (s)"); times have 3 significant digits.
/// Sub-stage lines (label starts with a space) are left out of the total, since their enclosing stage
/// already contains them; an empty label counts as a top-level stage. Left adjustment and precision 3
/// stay set on the stream afterwards.
std::ostream& report(std::ostream& out, const std::vector<TimingRecord>& records);

/// report(out, profiler.records()).
std::ostream& report(std::ostream& out, const StageProfiler& profiler);

/// The process-wide profiler, constructed empty when the library loads and alive for the whole process.
/// Not thread-safe, and not for use from other static initialisers.
StageProfiler& stageProfiler();

}  // namespace TessikSDK::Diagnostics

#include "diagnostics/stage_profiler.h"

#include <algorithm>
#include <iomanip>
#include <ostream>

namespace TessikSDK::Diagnostics {

namespace {

constexpr char kTotalLabel[] = "Total (s)";

StageProfiler theProfiler;

bool isSubStage(const std::string& label) { return !label.empty() && label.front() == ' '; }

}  // namespace

void StageProfiler::reset() { records_.clear(); }

int StageProfiler::startTimer(const std::string& label) {
  TimingRecord record{label, 0.0, Timer()};
  record.timer.restart();
  records_.push_back(record);
  return static_cast<int>(records_.size() - 1);
}

StageProfiler& StageProfiler::stopTimer(std::uint32_t index) {
  if (index < records_.size()) records_[index].seconds = records_[index].timer.elapsed(Seconds);
  return *this;
}

std::ostream& report(std::ostream& out, const std::vector<TimingRecord>& records) {
  std::size_t widest = sizeof(kTotalLabel) - 1;
  for (const TimingRecord& record : records) widest = std::max(widest, record.label.size());
  const int field = static_cast<int>(widest + 3);

  double total = 0.0;
  for (const TimingRecord& record : records) {
    out << std::setw(field) << std::left << record.label;
    // The tab pushes sub-stage times into a column of their own, apart from the stages that sum up.
    if (isSubStage(record.label)) {
      out << '\t';
    } else {
      total += record.seconds;
    }
    out << std::setprecision(3) << record.seconds << std::endl;
  }
  return out << std::setw(field) << std::left << kTotalLabel << total;
}

std::ostream& report(std::ostream& out, const StageProfiler& profiler) {
  return report(out, profiler.records());
}

StageProfiler& stageProfiler() { return theProfiler; }

}  // namespace TessikSDK::Diagnostics

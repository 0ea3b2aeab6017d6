#include "diagnostics/stage_profiler.h"

#include <cstdint>
#include <sstream>
#include <string>
#include <utility>
#include <vector>

#include <gtest/gtest.h>

namespace {

using TessikSDK::Diagnostics::Microseconds;
using TessikSDK::Diagnostics::report;
using TessikSDK::Diagnostics::StageProfiler;
using TessikSDK::Diagnostics::stageProfiler;
using TessikSDK::Diagnostics::Timer;
using TessikSDK::Diagnostics::TimingRecord;

std::string pad(std::size_t spaces) { return std::string(spaces, ' '); }

std::string reportOf(const std::vector<TimingRecord>& records) {
  std::ostringstream out;
  report(out, records);
  return out.str();
}

TEST(StageReport, LayoutTotalAndThreeSignificantDigits) {
  EXPECT_EQ(reportOf({}), "Total (s)" + pad(3) + "0");
  // Widest label is 30 characters, so every field is 33 wide; the sub-stage gets a tab and stays out of
  // the total because "Compute Octree" already contains it.
  std::ostringstream out;
  report(out, {{"Compute Octree", 1.5, Timer()},
               {"    Voxelizing volume boundary", 0.25, Timer()},
               {"Compute Weights", 2.0, Timer()}});
  EXPECT_EQ(out.str(), "Compute Octree" + pad(19) + "1.5\n" + "    Voxelizing volume boundary" + pad(3) +
                           "\t0.25\n" + "Compute Weights" + pad(18) + "2\n" + "Total (s)" + pad(24) + "3.5");
  EXPECT_EQ(out.precision(), 3);
  EXPECT_TRUE(out.flags() & std::ios::left);
  // An empty label is a top-level stage.
  EXPECT_EQ(reportOf({{"", 1.25, Timer()}, {" sub", 4.0, Timer()}}),
            pad(12) + "1.25\n" + " sub" + pad(8) + "\t4\n" + "Total (s)" + pad(3) + "1.25");
  const std::pair<double, std::string> digits[] = {
      {0.0123456, "0.0123"}, {1.23456, "1.23"}, {12.3456, "12.3"}, {1234.5, "1.23e+03"}, {0.0, "0"}};
  for (const auto& [seconds, text] : digits)
    EXPECT_EQ(reportOf({{"Stage", seconds, Timer()}}),
              "Stage" + pad(7) + text + "\nTotal (s)" + pad(3) + text);
}

TEST(StageProfiler, StopTimerSetsOnlyThatRecordAndIgnoresIndicesPastTheEnd) {
  StageProfiler profiler;
  ASSERT_EQ(profiler.startTimer("first"), 0);
  ASSERT_EQ(profiler.startTimer("    inner"), 1);
  ASSERT_EQ(profiler.startTimer("second"), 2);
  const Timer& timer = profiler.records()[1].timer;
  for (long i = 0; i < 200000000L && timer.elapsed(Microseconds) < 1; ++i) {
  }
  for (std::uint32_t index : {3u, 4u, 0xFFFFFFFFu}) EXPECT_EQ(&profiler.stopTimer(index), &profiler);
  EXPECT_EQ(&profiler.stopTimer(1), &profiler);
  ASSERT_EQ(profiler.records().size(), 3u);
  EXPECT_EQ(profiler.records()[1].label, "    inner");
  EXPECT_EQ(profiler.records()[0].seconds, 0.0);
  EXPECT_GE(profiler.records()[1].seconds, 1e-6);
  EXPECT_EQ(profiler.records()[2].seconds, 0.0);
  std::ostringstream out;
  report(out, profiler);
  EXPECT_EQ(out.str(), reportOf(profiler.records()));
  profiler.reset();
  EXPECT_TRUE(profiler.records().empty());
  EXPECT_EQ(profiler.startTimer("again"), 0);
  EXPECT_EQ(&stageProfiler(), &stageProfiler());
}

}  // namespace

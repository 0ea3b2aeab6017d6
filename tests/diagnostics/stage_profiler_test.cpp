#include "diagnostics/stage_profiler.h"

#include <cstdint>
#include <sstream>
#include <string>
#include <vector>

#include <gtest/gtest.h>

namespace {

using TessikSDK::Diagnostics::Microseconds;
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

TEST(StageReport, EmptyProfilerPrintsOnlyZeroTotal) {
  std::ostringstream out;
  report(out, StageProfiler());
  EXPECT_EQ(out.str(), "Total (s)" + pad(3) + "0");
}

// Widest label is 30 characters, so every field is 33 wide; the sub-stage gets a tab and stays out of
// the total because "Compute Octree" already contains it.
TEST(StageReport, SubStageIsTabbedAndLeftOutOfTotal) {
  const std::vector<TimingRecord> records = {{"Compute Octree", 1.5, Timer()},
                                             {"    Voxelizing volume boundary", 0.25, Timer()},
                                             {"Compute Weights", 2.0, Timer()}};
  std::ostringstream out;
  report(out, records);
  EXPECT_EQ(out.str(), "Compute Octree" + pad(19) + "1.5\n" + "    Voxelizing volume boundary" + pad(3) +
                           "\t0.25\n" + "Compute Weights" + pad(18) + "2\n" + "Total (s)" + pad(24) + "3.5");
  EXPECT_EQ(out.precision(), 3);
  EXPECT_TRUE(out.flags() & std::ios::left);
}

TEST(StageReport, EmptyLabelCountsAsTopLevelStage) {
  EXPECT_EQ(reportOf({{"", 1.25, Timer()}, {" sub", 4.0, Timer()}}),
            pad(12) + "1.25\n" + " sub" + pad(8) + "\t4\n" + "Total (s)" + pad(3) + "1.25");
}

struct PrecisionCase {
  double seconds;
  const char* text;
};

TEST(StageReport, TimesHaveThreeSignificantDigits) {
  const PrecisionCase cases[] = {
      {0.0123456, "0.0123"}, {1.23456, "1.23"}, {12.3456, "12.3"}, {1234.5, "1.23e+03"}, {0.0, "0"}};
  for (const PrecisionCase& c : cases) {
    EXPECT_EQ(reportOf({{"Stage", c.seconds, Timer()}}),
              "Stage" + pad(7) + c.text + "\n" + "Total (s)" + pad(3) + c.text)
        << c.seconds;
  }
}

class StageProfilerTest : public ::testing::Test {
 protected:
  void SetUp() override {
    ASSERT_EQ(profiler.startTimer("first"), 0);
    ASSERT_EQ(profiler.startTimer("    inner"), 1);
    ASSERT_EQ(profiler.startTimer("second"), 2);
  }
  StageProfiler profiler;
};

TEST_F(StageProfilerTest, StartTimerAppendsUnstoppedRecordsInOrder) {
  const std::vector<std::string> labels = {"first", "    inner", "second"};
  ASSERT_EQ(profiler.records().size(), labels.size());
  for (std::size_t i = 0; i < labels.size(); ++i) {
    EXPECT_EQ(profiler.records()[i].label, labels[i]);
    EXPECT_EQ(profiler.records()[i].seconds, 0.0);
  }
  profiler.reset();
  EXPECT_TRUE(profiler.records().empty());
  EXPECT_EQ(profiler.startTimer("again"), 0);
}

TEST_F(StageProfilerTest, StopTimerSetsOnlyThatRecord) {
  const Timer& timer = profiler.records()[1].timer;
  for (long i = 0; i < 200000000L && timer.elapsed(Microseconds) < 1; ++i) {
  }
  EXPECT_EQ(&profiler.stopTimer(1), &profiler);
  EXPECT_GE(profiler.records()[1].seconds, 1e-6);
  EXPECT_EQ(profiler.records()[0].seconds, 0.0);
  EXPECT_EQ(profiler.records()[2].seconds, 0.0);
}

TEST_F(StageProfilerTest, StopTimerOutOfRangeChangesNothing) {
  for (std::uint32_t index : {3u, 4u, 0xFFFFFFFFu}) {
    EXPECT_EQ(&profiler.stopTimer(index), &profiler);
    ASSERT_EQ(profiler.records().size(), 3u);
    for (const TimingRecord& record : profiler.records()) EXPECT_EQ(record.seconds, 0.0) << index;
  }
}

TEST_F(StageProfilerTest, ReportsItsRecords) {
  std::ostringstream out;
  report(out, profiler);
  EXPECT_EQ(out.str(), reportOf(profiler.records()));
}

TEST(StageProfilerShared, KeepsRecordsBetweenCalls) {
  stageProfiler().reset();
  stageProfiler().startTimer("Compute Octree");
  ASSERT_EQ(stageProfiler().records().size(), 1u);
  EXPECT_EQ(stageProfiler().records()[0].label, "Compute Octree");
  stageProfiler().reset();
  EXPECT_TRUE(stageProfiler().records().empty());
}

}  // namespace

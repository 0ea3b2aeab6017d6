#include "geombind/progress.h"

#include <iostream>
#include <sstream>
#include <string>

#include <gtest/gtest.h>

namespace {

using TessikSDK::GeomBind::ProgressImpl;

// Captures std::cout for the lifetime of the fixture.
class ConsoleProgress : public ::testing::Test {
 protected:
  void SetUp() override { saved = std::cout.rdbuf(captured.rdbuf()); }
  void TearDown() override { std::cout.rdbuf(saved); }
  std::ostringstream captured;
  std::streambuf* saved = nullptr;
  ProgressImpl progress;
};

TEST_F(ConsoleProgress, WritesOneLinePerPhase) {
  progress.begin("Voxelizing model ... ", 40, 0);
  EXPECT_EQ(captured.str(), "Starting Voxelizing model ...  ... ");
  progress.setRange(10, 2);
  EXPECT_FALSE(progress.update(5));
  EXPECT_FALSE(progress.isCanceled());
  progress.end();
  EXPECT_EQ(captured.str(), "Starting Voxelizing model ...  ... done \n");
}

TEST_F(ConsoleProgress, ShorterTitleLeavesNoTraceOfTheLonger) {
  progress.begin("a long phase title", 1, 0);
  progress.begin("short", 1, 0);
  EXPECT_EQ(progress.taskName, "short");
  EXPECT_EQ(captured.str(), "Starting a long phase title ... Starting short ... ");
}

TEST_F(ConsoleProgress, EndWithoutBeginStillFinishesTheLine) {
  progress.end();
  EXPECT_EQ(captured.str(), "done \n");
}

}  // namespace

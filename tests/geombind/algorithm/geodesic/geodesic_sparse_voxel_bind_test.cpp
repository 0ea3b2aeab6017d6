#include "geombind/algorithm/geodesic/geodesic_sparse_voxel_bind.h"

#include <gtest/gtest.h>

namespace {

using namespace TessikSDK::GeomBind::Algorithm;

TEST(GeodesicOptions, CeilLog2IsTheDepthReachingN) {
  const std::pair<int, int> cases[] = {{-5, 0}, {0, 0},   {1, 0},     {2, 1},     {3, 2},          {64, 6},
                                       {65, 7}, {128, 7}, {1024, 10}, {1025, 11}, {0x7FFFFFFF, 31}};
  for (auto [n, expected] : cases) EXPECT_EQ(ceilLog2(n), expected) << n;
}

TEST(GeodesicOptions, SmoothingPassesFollowTheResolutionTable) {
  const std::pair<int, int> cases[] = {{-1, 4},  {1, 4},   {64, 4},  {65, 4},   {128, 4},  {129, 3},
                                       {256, 3}, {257, 2}, {512, 2}, {1024, 2}, {1025, 2}, {1 << 30, 2}};
  for (auto [resolution, passes] : cases) EXPECT_EQ(smoothingIterationsFor(resolution), passes) << resolution;
}

}  // namespace

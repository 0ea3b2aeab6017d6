#include "geombind/cpu/axis_sweep_voxelizer.h"

#include <cmath>
#include <string>
#include <tuple>
#include <vector>

#include <gtest/gtest.h>

#include "meshes/character.h"
#include "meshes/mesh_builders.h"
#include "support/voxel_shapes.h"

namespace {

using namespace TessikSDK::GeomBind;
using tessik::test::NoProgress;
using tessik::test::ShapeCase;
using tessik::test::unitFrameMesh;

AxisVoteGrid emptyVotes(const std::array<std::uint32_t, 3>& dims) {
  return {dims, std::vector<std::uint8_t>(std::size_t{dims[0]} * dims[1] * dims[2], 0)};
}

TEST(AxisSweepVotes, EverySweepFlagsTheVoxelsWhoseFacePointIsInside) {
  const tessik::test::SweepFlagProbe probe;
  AxisVoteGrid votes = emptyVotes(probe.dims);
  NoProgress progress;
  Cpu::castAxisVotes(progress, probe.mesh, votes);
  EXPECT_EQ(probe.mismatches(votes), 0u);
}

class AxisSweepShapes : public ::testing::TestWithParam<std::tuple<ShapeCase, std::uint32_t>> {};

// Every sweep is exact for a sample point off the surface, and a voxel's sampled face points lie half a
// voxel from its centre: so only voxels whose centre is within half a voxel of the surface (plus the
// tessellation's 0.001) may disagree with the analytic shape.
TEST_P(AxisSweepShapes, DisagreesOnlyWithinHalfAVoxelOfTheSurface) {
  const auto& [shape, n] = GetParam();
  const MeshData mesh = unitFrameMesh(shape.build());
  VoxelBitGrid grid(n, n, n);
  NoProgress progress;
  Cpu::voxelizeInterior(progress, mesh, grid, false, 0.2f);
  const double voxel = tessik::test::voxelSize(mesh, grid.dims).x;
  std::uint64_t inside = 0, far = 0;
  for (std::uint64_t i = 0; i < grid.cellCount(); ++i) {
    const double distance = shape.sdf(tessik::test::voxelCentre(mesh, grid, i));
    inside += distance < 0;
    far += (distance < 0) != grid.test(i) && std::fabs(distance) > 0.5 * voxel + 0.001;
  }
  EXPECT_GT(inside, 0u);
  EXPECT_EQ(far, 0u);
}

INSTANTIATE_TEST_SUITE_P(Cpu,
                         AxisSweepShapes,
                         ::testing::Combine(::testing::ValuesIn(tessik::test::shapes()),
                                            ::testing::Values(32u, 48u, 100u)),
                         [](const auto& info) {
                           return std::string(std::get<0>(info.param).name) + "_" +
                                  std::to_string(std::get<1>(info.param));
                         });

TEST(AxisSweepVotes, SameForAnyThreadCount) {
  const MeshData mesh = tessik::test::fitToUnitFrame(tessik::meshes::character(0.4).mesh);
  NoProgress progress;
  std::vector<AxisVoteGrid> runs;
  for (const int threads : {1, 2, 4}) {
    runs.push_back(emptyVotes({48, 48, 48}));
    Cpu::castAxisVotes(progress, mesh, runs.back(), threads);
  }
  EXPECT_GT(std::count(runs[0].votes.begin(), runs[0].votes.end(), 63), 100);
  EXPECT_EQ(runs[1].votes, runs[0].votes);
  EXPECT_EQ(runs[2].votes, runs[0].votes);
}

// A cup (a box without its +z face) and a small cube in a far corner that makes the slices above the
// cup count: voxels over the opening see the cup's floor from inside along z only, so they get one
// vote, and refinement settles exactly those by the winding number at their centre.
TEST(AxisSweepRefinement, OneVoteVoxelsFollowTheWindingNumber) {
  tessik::meshes::TriMesh open = tessik::meshes::box({0.2f, 0.2f, 0.1f}, {0.8f, 0.8f, 0.5f});
  open.triangles.erase(open.triangles.begin() + 2, open.triangles.begin() + 4);
  open.append(tessik::meshes::box({0.85f, 0.85f, 0.85f}, {0.95f, 0.95f, 0.95f}));
  const MeshData mesh = unitFrameMesh(open);
  const std::uint32_t n = 20;
  AxisVoteGrid votes = emptyVotes({n, n, n});
  NoProgress progress;
  Cpu::castAxisVotes(progress, mesh, votes);
  VoxelBitGrid refined(n, n, n), plain(n, n, n);
  Cpu::voxelizeInterior(progress, mesh, refined, true, 0.2f);
  Cpu::voxelizeInterior(progress, mesh, plain, false, 0.2f);
  int settled[2] = {0, 0};
  for (std::uint32_t i = 0; i < n * n * n; ++i) {
    const int axisVotes = ((votes.votes[i] & kAxisVoteMasks[0]) != 0) +
                          ((votes.votes[i] & kAxisVoteMasks[1]) != 0) +
                          ((votes.votes[i] & kAxisVoteMasks[2]) != 0);
    EXPECT_EQ(plain.test(i), axisVotes >= 2) << i;
    bool expected = axisVotes >= 2;
    if (axisVotes == 1) {
      const glm::dvec3 c = tessik::test::voxelCentre(mesh, refined, i);
      expected = windingNumber(mesh, {float(c.x), float(c.y), float(c.z)}) > 0.2f;
      ++settled[expected];
    }
    EXPECT_EQ(refined.test(i), expected) << i;
  }
  EXPECT_GT(settled[0], 0);
  EXPECT_GT(settled[1], 0);
}

TEST(AxisSweepContract, KeepsSetBitsAndStopsForEmptyMeshOrCancel) {
  // Voxel centres lie at 1/8, 3/8, 5/8 and 7/8: layers 1 and 2 are inside on every axis.
  const MeshData mesh = unitFrameMesh(tessik::meshes::box({0.3f, 0.3f, 0.3f}, {0.7f, 0.7f, 0.7f}));
  NoProgress progress;
  VoxelBitGrid grid(4, 4, 4);
  grid.set(0);  // outside the box, set by the boundary pass
  Cpu::voxelizeInterior(progress, MeshData(), grid, true, 0.2f);
  EXPECT_EQ(grid.bits[0], 1u);
  progress.canceled = true;
  Cpu::voxelizeInterior(progress, mesh, grid, true, 0.2f);
  EXPECT_EQ(grid.bits[0], 1u);
  progress.canceled = false;
  Cpu::voxelizeInterior(progress, mesh, grid, true, 0.2f);
  EXPECT_TRUE(grid.test(0));
  EXPECT_TRUE(grid.test(grid.cellIndex(1, 2, 2)));
  EXPECT_FALSE(grid.test(grid.cellIndex(0, 2, 2)));
}

}  // namespace

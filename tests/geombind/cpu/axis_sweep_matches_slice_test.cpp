#include <cmath>
#include <iostream>
#include <string>
#include <tuple>

#include <gtest/gtest.h>

#include "geombind/cpu/axis_sweep_voxelizer.h"
#include "geombind/gpu/slice_voxelizer.h"
#include "meshes/character.h"
#include "support/gl_context_fixture.h"
#include "support/voxel_shapes.h"

namespace {

using namespace TessikSDK::GeomBind;
using tessik::test::NoProgress;
using tessik::test::ShapeCase;

class AxisSweepMatchesSlices : public tessik::test::GLContextTest,
                               public ::testing::WithParamInterface<std::tuple<ShapeCase, std::uint32_t>> {};

// Both voxelizers are exact for sample points off the surface, so they may differ only on voxels whose
// centre lies within half a voxel of it (plus the tessellation's 0.001).
TEST_P(AxisSweepMatchesSlices, DifferOnlyWithinHalfAVoxelOfTheSurface) {
  const auto& [shape, n] = GetParam();
  const MeshData mesh = tessik::test::unitFrameMesh(shape.build());
  VoxelBitGrid cpu(n, n, n), gpu(n, n, n);
  NoProgress progress;
  Cpu::voxelizeInterior(progress, mesh, cpu, false, 0.2f);
  Gpu::voxelizeInterior(progress, mesh, gpu, false, 0.2f);
  const double voxel = tessik::test::voxelSize(mesh, cpu.dims).x;
  std::uint64_t differ = 0, far = 0;
  for (std::uint64_t i = 0; i < cpu.cellCount(); ++i) {
    if (cpu.test(i) == gpu.test(i)) continue;
    ++differ;
    far += std::fabs(shape.sdf(tessik::test::voxelCentre(mesh, cpu, i))) > 0.5 * voxel + 0.001;
  }
  std::cout << "[ voxels ] " << shape.name << " at " << n << ": " << differ << " differ\n";
  EXPECT_EQ(far, 0u);
}

INSTANTIATE_TEST_SUITE_P(Shapes,
                         AxisSweepMatchesSlices,
                         ::testing::Combine(::testing::ValuesIn(tessik::test::shapes()),
                                            ::testing::Values(48u, 64u)),
                         [](const auto& info) {
                           return std::string(std::get<0>(info.param).name) + "_" +
                                  std::to_string(std::get<1>(info.param));
                         });

// The character has no analytic shape; its sweeps are compared flag by flag instead. Flags differ only
// where a ray grazes an edge or a slice touches a vertex, so very few may.
TEST_F(AxisSweepMatchesSlices, CharacterVotesAlmostAllAgree) {
  const MeshData mesh = tessik::test::fitToUnitFrame(tessik::meshes::character(0.4).mesh);
  const std::array<std::uint32_t, 3> dims = {64, 64, 64};
  AxisVoteGrid cpu{dims, std::vector<std::uint8_t>(64 * 64 * 64, 0)}, gpu = cpu;
  NoProgress progress;
  Cpu::castAxisVotes(progress, mesh, cpu);
  ASSERT_TRUE(Gpu::castAxisVotes(mesh, gpu));
  std::uint64_t flags = 0, differ = 0;
  for (std::size_t i = 0; i < cpu.votes.size(); ++i)
    for (int bit = 0; bit < 6; ++bit) {
      flags += (gpu.votes[i] >> bit) & 1u;
      differ += ((cpu.votes[i] ^ gpu.votes[i]) >> bit) & 1u;
    }
  std::cout << "[ votes  ] character at 64: " << differ << " of " << flags << " flags differ\n";
  EXPECT_GT(flags, 10000u);
  EXPECT_LE(differ, flags / 200);
}

}  // namespace

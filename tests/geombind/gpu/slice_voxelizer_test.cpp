#include "geombind/gpu/slice_voxelizer.h"

#include <algorithm>
#include <cmath>
#include <functional>
#include <iostream>
#include <sstream>
#include <string>
#include <vector>

#include <glm/glm.hpp>
#include <gtest/gtest.h>

#include "meshes/mesh_builders.h"
#include "support/gl_context_fixture.h"
#include "support/voxel_shapes.h"

namespace {

using namespace TessikSDK::GeomBind;
using tessik::meshes::TriMesh;
using Vec3 = tessik::meshes::Vec3;

using tessik::test::NoProgress;
using tessik::test::ShapeCase;
using tessik::test::unitFrameMesh;
using tessik::test::voxelSize;

class SliceVoxelizerGL : public tessik::test::GLContextTest {};

class InteriorMatchesReference : public tessik::test::GLContextTest,
                                 public ::testing::WithParamInterface<std::tuple<ShapeCase, std::uint32_t>> {
};

// Voxels may only disagree with the analytic shape where their centre lies within a voxel of the surface.
TEST_P(InteriorMatchesReference, DisagreesOnlyNextToTheSurface) {
  const auto& [shape, n] = GetParam();
  const MeshData mesh = unitFrameMesh(shape.build());
  VoxelBitGrid grid(n, n, n);
  NoProgress progress;
  Gpu::voxelizeInterior(progress, mesh, grid, false, 0.2f);
  const glm::dvec3 d = voxelSize(mesh, grid.dims);
  std::size_t inside = 0, disagreements = 0;
  double worst = 0.0;
  for (std::uint32_t z = 0; z < n; ++z)
    for (std::uint32_t y = 0; y < n; ++y)
      for (std::uint32_t x = 0; x < n; ++x) {
        const glm::dvec3 centre = mesh.boundingBox.lower + (glm::dvec3(x, y, z) + 0.5) * d;
        const double distance = shape.sdf(centre);
        inside += distance < 0;
        if ((distance < 0) != grid.test(grid.cellIndex(x, y, z))) {
          ++disagreements;
          worst = std::max(worst, std::fabs(distance) / d.x);
        }
      }
  std::cout << "[ voxels ] " << shape.name << " at " << n << ": " << disagreements << " of " << inside
            << " inside voxels disagree, farthest " << worst << " voxel from the surface\n";
  EXPECT_GT(inside, 0u);
  EXPECT_LE(worst, 1.0);
  EXPECT_LT(disagreements, inside / 4 + 8);
}

INSTANTIATE_TEST_SUITE_P(Gpu,
                         InteriorMatchesReference,
                         ::testing::Combine(::testing::ValuesIn(tessik::test::shapes()),
                                            ::testing::Values(16u, 40u, 64u)),
                         [](const auto& info) {
                           return std::string(std::get<0>(info.param).name) + "_" +
                                  std::to_string(std::get<1>(info.param));
                         });

// Forty layers along x also take each x sweep through a readback after 32 slices and a second one at
// the end.
TEST_F(SliceVoxelizerGL, EverySweepFlagsTheVoxelsWhoseFacePointIsInside) {
  const tessik::test::SweepFlagProbe probe;
  AxisVoteGrid votes{probe.dims, std::vector<std::uint8_t>(std::size_t{40} * 12 * 18, 0)};
  ASSERT_TRUE(Gpu::castAxisVotes(probe.mesh, votes));
  EXPECT_EQ(probe.mismatches(votes), 0u);
}

TEST(SliceVoxelizerPacking, SliceThirteenIsBitFiveOfGreen) {
  const Gpu::AccumulatorBit bit = Gpu::accumulatorBit(13);
  EXPECT_EQ(bit.component, 1);
  EXPECT_FLOAT_EQ(bit.bitValue, 32.0f / 255.0f);
  EXPECT_EQ(Gpu::accumulatorBit(32).component, 0) << "a fresh accumulator starts again at bit 0";
  EXPECT_FLOAT_EQ(Gpu::accumulatorBit(31).bitValue, 128.0f / 255.0f);
}

// A cup (a box without its +z face) and, higher up in a corner, a small cube that makes the slices
// above the cup render: voxels over the opening see the cup's floor from inside along z only, so they
// get one vote, and refinement settles exactly those by the winding number at their centre.
TEST_F(SliceVoxelizerGL, OneVoteVoxelsFollowTheWindingNumber) {
  TriMesh open = tessik::meshes::box({0.2f, 0.2f, 0.1f}, {0.8f, 0.8f, 0.5f});
  open.triangles.erase(open.triangles.begin() + 2, open.triangles.begin() + 4);
  open.append(tessik::meshes::box({0.85f, 0.85f, 0.85f}, {0.95f, 0.95f, 0.95f}));
  const MeshData mesh = unitFrameMesh(open);
  const std::uint32_t n = 20;
  AxisVoteGrid votes{{n, n, n}, std::vector<std::uint8_t>(n * n * n, 0)};
  ASSERT_TRUE(Gpu::castAxisVotes(mesh, votes));
  VoxelBitGrid refined(n, n, n), plain(n, n, n);
  NoProgress progress;
  Gpu::voxelizeInterior(progress, mesh, refined, true, 0.2f);
  Gpu::voxelizeInterior(progress, mesh, plain, false, 0.2f);
  const glm::dvec3 d = voxelSize(mesh, refined.dims);
  int settledIn = 0, settledOut = 0;
  for (std::uint32_t i = 0; i < n * n * n; ++i) {
    const int axisVotes =
        ((votes.votes[i] & 3) != 0) + ((votes.votes[i] & 12) != 0) + ((votes.votes[i] & 48) != 0);
    EXPECT_EQ(plain.test(i), axisVotes >= 2) << i;
    if (axisVotes != 1) {
      EXPECT_EQ(refined.test(i), axisVotes >= 2) << i;
      continue;
    }
    const glm::dvec3 c = mesh.boundingBox.lower + (glm::dvec3(i % n, i / n % n, i / (n * n)) + 0.5) * d;
    const bool inside = windingNumber(mesh, {float(c.x), float(c.y), float(c.z)}) > 0.2f;
    EXPECT_EQ(refined.test(i), inside) << i;
    (inside ? settledIn : settledOut) += 1;
  }
  EXPECT_GT(settledIn, 0);
  EXPECT_GT(settledOut, 0);
}

TEST_F(SliceVoxelizerGL, LeavesTheDocumentedGLState) {
  glClearColor(0.25f, 0.5f, 0.75f, 1.0f);
  const MeshData mesh = unitFrameMesh(tessik::meshes::sphere({0.5f, 0.5f, 0.5f}, 0.3f, 8, 16));
  VoxelBitGrid grid(8, 8, 8);
  NoProgress progress;
  Gpu::voxelizeInterior(progress, mesh, grid, true, 0.2f);
  GLint value = -1;
  EXPECT_FALSE(glIsEnabled(GL_CULL_FACE));
  EXPECT_TRUE(glIsEnabled(GL_DEPTH_TEST));
  EXPECT_FALSE(glIsEnabled(GL_VERTEX_ARRAY));
  const std::pair<GLenum, GLint> expected[] = {
      {GL_CULL_FACE_MODE, GL_BACK},        {GL_CURRENT_PROGRAM, 0},    {GL_FRAMEBUFFER_BINDING, 0},
      {GL_ACTIVE_TEXTURE, GL_TEXTURE0},    {GL_TEXTURE_BINDING_2D, 0}, {GL_ARRAY_BUFFER_BINDING, 0},
      {GL_ELEMENT_ARRAY_BUFFER_BINDING, 0}};
  for (const auto& [name, want] : expected) {
    glGetIntegerv(name, &value);
    EXPECT_EQ(value, want) << std::hex << name;
  }
  glActiveTexture(GL_TEXTURE1);
  glGetIntegerv(GL_TEXTURE_BINDING_2D, &value);
  EXPECT_EQ(value, 0);
  glActiveTexture(GL_TEXTURE0);
  GLfloat clear[4];
  glGetFloatv(GL_COLOR_CLEAR_VALUE, clear);
  EXPECT_EQ(clear[2], 0.75f);
  EXPECT_GT(std::count(grid.bits.begin(), grid.bits.end(), 0u), 0)
      << "sanity: a small sphere leaves empty words";
}

TEST_F(SliceVoxelizerGL, EmptyMeshOrBrokenShaderLeaveEverythingAlone) {
  glEnable(GL_CULL_FACE);
  VoxelBitGrid grid(4, 4, 4);
  grid.set(5);
  NoProgress progress;
  Gpu::voxelizeInterior(progress, MeshData(), grid, false, 0.2f);
  EXPECT_TRUE(glIsEnabled(GL_CULL_FACE)) << "an empty mesh must not touch GL";

  const MeshData mesh = unitFrameMesh(tessik::meshes::box({0.1f, 0.1f, 0.1f}, {0.9f, 0.9f, 0.9f}));
  Gpu::ShaderSources broken = Gpu::builtinShaders();
  broken.fsSlicer = "void main( ) { gl_FragColor = vec4( undeclared ); }\n";
  AxisVoteGrid votes{grid.dims, std::vector<std::uint8_t>(64, 0)};
  std::ostringstream captured;
  std::streambuf* saved = std::cerr.rdbuf(captured.rdbuf());
  const bool ran = Gpu::castAxisVotes(mesh, votes, broken);
  std::cerr.rdbuf(saved);
  EXPECT_FALSE(ran);
  EXPECT_NE(captured.str().find("[ Shader FSSlicer ]: "), std::string::npos) << captured.str();
  EXPECT_EQ(std::count(votes.votes.begin(), votes.votes.end(), 0), 64);
  EXPECT_EQ(grid.bits[0], 1u << 5);
}

TEST(SliceVoxelizerVotes, TwoAxesDecideAndSetBitsAreNeverAmbiguous) {
  AxisVoteGrid votes{{6, 1, 1}, {0, 1 | 2, 1 | 4, 16 | 32, 2 | 8 | 32, 4}};
  VoxelBitGrid grid(6, 1, 1);
  grid.set(5);  // set by the boundary pass, one vote: stays set, never listed
  NoProgress progress;
  std::vector<std::uint32_t> ambiguous;
  classifyVotes(progress, votes, grid, true, ambiguous);
  EXPECT_EQ(grid.bits[0], (1u << 2) | (1u << 4) | (1u << 5));
  std::sort(ambiguous.begin(), ambiguous.end());
  EXPECT_EQ(ambiguous, (std::vector<std::uint32_t>{1, 3}));

  VoxelBitGrid untouched(6, 1, 1);
  ambiguous.clear();
  progress.canceled = true;
  classifyVotes(progress, votes, untouched, true, ambiguous);
  EXPECT_EQ(untouched.bits[0], 0u);
  EXPECT_TRUE(ambiguous.empty());
}

TEST(SliceVoxelizerWinding, OneInsideZeroOutsideAHalfOnTheOpenSide) {
  const MeshData sphere = unitFrameMesh(tessik::meshes::sphere({0.5f, 0.5f, 0.5f}, 0.4f, 16, 32));
  EXPECT_NEAR(windingNumber(sphere, {0.5f, 0.55f, 0.45f}), 1.0f, 1e-3f);
  EXPECT_NEAR(windingNumber(sphere, {0.95f, 0.5f, 0.5f}), 0.0f, 1e-3f);
  EXPECT_EQ(windingNumber(MeshData(), {0.5f, 0.5f, 0.5f}), 0.0f);
  // A single square seen from just in front of its middle covers almost half the sphere of directions.
  TriMesh square;
  for (auto p : {Vec3{0, 0, 0}, Vec3{1, 0, 0}, Vec3{1, 1, 0}, Vec3{0, 1, 0}}) square.add(p[0], p[1], p[2]);
  tessik::meshes::quad(square, 0, 1, 2, 3);
  EXPECT_NEAR(windingNumber(unitFrameMesh(square), {0.5f, 0.5f, -0.001f}), 0.5f, 0.01f);
}

}  // namespace

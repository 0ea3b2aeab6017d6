#include "preview_raster.h"

#include <algorithm>
#include <array>
#include <cstdint>
#include <vector>

#include <gtest/gtest.h>
#include <omp.h>

#include "headless_gl/headless_gl.h"
#include "pose.h"
#include "preview.h"
#include "preview_scenes.h"

namespace {

using namespace tessik::bind;
using tessik::test::PreviewInput;
using tessik::test::translate;

// No test here makes a GL context, so each one shows the processor's path working without one.
class PreviewOnCpu : public ::testing::Test {
 protected:
  void SetUp() override { ASSERT_TRUE(tessik::support::currentGLVersionString().empty()); }

  void draw(const PreviewInput& shown, int width, int height) {
    in = shown;
    options = {width, height, PreviewDevice::cpu};
    image = renderPreviewPixels(in.mesh, in.skeleton, in.jointWorld, in.weights, options);
    ASSERT_EQ(image.size(), static_cast<std::size_t>(width) * height * 4);
  }
  // The output pixel that mesh-space point (x, y) falls in.
  std::array<int, 3> at(double x, double y) const {
    const preview::Framing f =
        preview::makeScene(in.mesh, in.skeleton, in.jointWorld, in.weights, options).framing;
    const auto px = static_cast<std::size_t>((x - f.left) / f.unitsPerPixel);
    const auto py = static_cast<std::size_t>((f.top - y) / f.unitsPerPixel);
    const std::uint8_t* p = &image[(py * options.width + px) * 4];
    return {p[0], p[1], p[2]};
  }
  // Whether the pixel at (x, y) has joint `joint`'s hue, whatever its shading.
  void expectJointHue(double x, double y, std::uint32_t joint) const {
    const std::array<int, 3> seen = at(x, y);
    const Vec3f c = jointColour(joint);
    const float seenTop = std::max({seen[0], seen[1], seen[2], 1}) * 1.0f;
    const float top = std::max({c[0], c[1], c[2]});
    for (int k = 0; k < 3; ++k)
      EXPECT_NEAR(seen[k] / seenTop, c[k] / top, 0.06f) << "joint " << joint << " at " << x << ", " << y;
  }

  PreviewInput in;
  PreviewOptions options;
  std::vector<std::uint8_t> image;
};

TEST_F(PreviewOnCpu, EachBoneColoursWhereItDominates) {
  draw(tessik::test::previewTube(), 256, 320);
  expectJointHue(0.15, 0.4, 0);
  expectJointHue(0.15, 1.6, 1);
}

TEST_F(PreviewOnCpu, DrawsTheOutlinedSkeletonInFrontOfTheMesh) {
  // The tube's near wall hides its axis, where the bone runs: white there means the bone is on top.
  draw(tessik::test::previewTube(), 800, 800);
  const double unit =
      preview::makeScene(in.mesh, in.skeleton, in.jointWorld, in.weights, options).framing.unitsPerPixel;
  int whiteRun = 0, darkAfterWhite = 0;
  for (int step = -8; step <= 8; ++step) {
    const std::array<int, 3> p = at(step * unit, 0.5);
    const bool white = std::min({p[0], p[1], p[2]}) >= 250;
    whiteRun += white ? 1 : 0;
    darkAfterWhite += !white && whiteRun > 0 && std::max({p[0], p[1], p[2]}) < 40 ? 1 : 0;
  }
  EXPECT_GE(whiteRun, 2);
  EXPECT_GE(darkAfterWhite, 1) << "the white bar has no outline";
  expectJointHue(6 * unit + 0.1, 0.5, 0);  // past the outline, the mesh again
  const std::array<int, 3> dot = at(0.0, 1.0);
  EXPECT_GE(std::min({dot[0], dot[1], dot[2]}), 250) << "no dot at the knee";
}

// Two squares facing the camera: joint 1's, small and near (z = 1), over joint 0's, large and far.
struct OverlapCase {
  const char* name;
  bool nearFirst;
  bool nearFacesAway;  // wound clockwise as seen from the camera
};

class PreviewOnCpuOverlap : public PreviewOnCpu, public ::testing::WithParamInterface<OverlapCase> {};

TEST_P(PreviewOnCpuOverlap, NearerSurfaceHidesFartherOne) {
  PreviewInput squares;
  const auto square = [&](float half, float z, std::uint32_t joint, bool clockwise) {
    const auto base = static_cast<std::uint32_t>(squares.mesh.positions.size());
    for (const auto& [x, y] : {std::pair{-half, -half}, {half, -half}, {half, half}, {-half, half}}) {
      squares.mesh.positions.push_back({x, y, z});
      squares.weights.influences.push_back({joint, 1.0});
      squares.weights.offsets.push_back(static_cast<std::uint32_t>(squares.weights.influences.size()));
    }
    const std::uint32_t b = clockwise ? 3 : 1, d = clockwise ? 1 : 3;
    squares.mesh.triangles.push_back({base, base + b, base + 2});
    squares.mesh.triangles.push_back({base, base + 2, base + d});
  };
  const OverlapCase& c = GetParam();
  if (!c.nearFirst) square(1.0f, -1.0f, 0, false);
  square(0.5f, 1.0f, 1, c.nearFacesAway);
  if (c.nearFirst) square(1.0f, -1.0f, 0, false);
  squares.skeleton.joints = {{"a", -1, translate(-1, -1.2, 0)}, {"b", -1, translate(1, -1.2, 0)}};
  squares.jointWorld = {squares.skeleton.joints[0].bindPose, squares.skeleton.joints[1].bindPose};
  draw(squares, 200, 200);
  expectJointHue(0.1, 0.2, 1);
  expectJointHue(0.75, 0.75, 0);
}

INSTANTIATE_TEST_SUITE_P(Preview,
                         PreviewOnCpuOverlap,
                         ::testing::Values(OverlapCase{"near_drawn_last", false, false},
                                           OverlapCase{"near_drawn_first", true, false},
                                           OverlapCase{"near_faces_away", true, true}),
                         [](const auto& info) { return std::string(info.param.name); });

TEST_F(PreviewOnCpu, SameBytesForAnyThreadCount) {
  PreviewInput bent = tessik::test::previewCharacter();
  bent.jointWorld = posedJointTransforms(bent.skeleton, {{"r_knee", 40, 0, 0}});
  bent.mesh = deformMesh(bent.mesh, bent.skeleton, bent.jointWorld, bent.weights);
  const int threads = omp_get_max_threads();
  omp_set_num_threads(1);
  draw(bent, 203, 157);  // bands of rows that do not divide the height
  const std::vector<std::uint8_t> serial = image;
  omp_set_num_threads(4);
  draw(bent, 203, 157);
  omp_set_num_threads(threads);
  EXPECT_TRUE(image == serial);
}

}  // namespace

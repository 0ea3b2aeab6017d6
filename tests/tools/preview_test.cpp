#include "preview.h"

#include <algorithm>
#include <array>
#include <cmath>
#include <cstdint>
#include <cstdio>
#include <ostream>
#include <stdexcept>
#include <string>
#include <vector>

#include <gtest/gtest.h>
#include <stb_image.h>

#include "gl/gl_api.h"
#include "pose.h"
#include "preview_scenes.h"
#include "support/gl_context_fixture.h"

namespace {

using namespace tessik::bind;

using Rgb = std::array<int, 3>;

// Each channel over the largest, so that shading, which scales all three alike, drops out.
std::array<float, 3> chroma(float r, float g, float b) {
  const float top = std::max({r, g, b, 1e-6f});
  return {r / top, g / top, b / top};
}

class PreviewTube : public tessik::test::GLContextTest {
 protected:
  void SetUp() override {
    GLContextTest::SetUp();
    if (IsSkipped() || HasFatalFailure()) return;
    tessik::test::PreviewInput tube = tessik::test::previewTube();
    mesh = std::move(tube.mesh);
    skeleton = std::move(tube.skeleton);
    weights = std::move(tube.weights);
    bindPoses = std::move(tube.jointWorld);
  }

  std::vector<std::uint8_t> render(const SurfaceMesh& shown, const std::vector<Mat4>& world) const {
    return renderPreviewPixels(shown, skeleton, world, weights, options);
  }
  Rgb pixel(const std::vector<std::uint8_t>& image, int x, int y) const {
    const std::size_t i = (static_cast<std::size_t>(y) * options.width + x) * 4;
    return {image[i], image[i + 1], image[i + 2]};
  }

  SurfaceMesh mesh;
  Skeleton skeleton;
  VertexWeights weights;
  std::vector<Mat4> bindPoses;
  PreviewOptions options{256, 320};
};

TEST_F(PreviewTube, ColoursEachEndByItsJoint) {
  const std::vector<std::uint8_t> image = render(mesh, bindPoses);
  ASSERT_EQ(image.size(), 256u * 320u * 4u);
  const Rgb background = pixel(image, 0, 0);
  const int cx = options.width / 2;
  int top = 0, bottom = options.height - 1, right = cx;
  while (top < bottom && pixel(image, cx, top) == background) ++top;
  while (bottom > top && pixel(image, cx, bottom) == background) --bottom;
  while (right + 1 < options.width && pixel(image, right + 1, (top + bottom) / 2) != background) ++right;
  ASSERT_GT(bottom - top, options.height / 2) << "the tube should fill most of the height";
  ASSERT_GT(right - cx, 8) << "the tube has no width";
  // The tube is 0.6 wide and 2 long, plus the skeleton's end dots of a few pixels: not stretched.
  EXPECT_NEAR(2.0 * (right - cx) / (bottom - top), 0.3, 0.02);

  // A fifth of the way in from each end, halfway between the skeleton and the silhouette.
  const int x = cx + (right - cx) / 2;
  const Rgb low = pixel(image, x, bottom - (bottom - top) / 5);
  const Rgb high = pixel(image, x, top + (bottom - top) / 5);
  for (const auto& [seen, joint] : {std::make_pair(low, 0u), std::make_pair(high, 1u)}) {
    const Vec3f c = jointColour(joint);
    const auto expected = chroma(c[0], c[1], c[2]);
    const auto actual =
        chroma(static_cast<float>(seen[0]), static_cast<float>(seen[1]), static_cast<float>(seen[2]));
    for (int k = 0; k < 3; ++k)
      EXPECT_NEAR(actual[k], expected[k], 0.06f) << "joint " << joint << " channel " << k;
  }
  EXPECT_GT(std::abs(low[0] - high[0]) + std::abs(low[1] - high[1]) + std::abs(low[2] - high[2]), 90)
      << "the two joints should look clearly different";
}

TEST_F(PreviewTube, DrawsTheSkeletonOverTheMesh) {
  const std::vector<std::uint8_t> image = render(mesh, bindPoses);
  // Only the skeleton is white; it runs up the middle, inside the tube, from y = 0 to 2.
  int whiteRows = 0;
  for (int y = 0; y < options.height; ++y) {
    bool white = false;
    for (int x = options.width / 2 - 2; x <= options.width / 2 + 1; ++x) {
      const Rgb p = pixel(image, x, y);
      white = white || std::min({p[0], p[1], p[2]}) >= 240;
    }
    whiteRows += white ? 1 : 0;
  }
  EXPECT_GT(whiteRows, options.height * 2 / 3);
}

TEST_F(PreviewTube, PosedMeshChangesThePicture) {
  const std::vector<Mat4> posed = posedJointTransforms(skeleton, {{"knee", 0, 0, 90}});
  const std::vector<std::uint8_t> rest = render(mesh, bindPoses);
  const std::vector<std::uint8_t> bent = render(deformMesh(mesh, skeleton, posed, weights), posed);
  ASSERT_EQ(rest.size(), bent.size());
  int changed = 0;
  for (std::size_t i = 0; i < rest.size(); i += 4)
    changed += std::abs(rest[i] - bent[i]) + std::abs(rest[i + 1] - bent[i + 1]) > 40 ? 1 : 0;
  EXPECT_GT(changed, options.width * options.height / 20);
  // Bent, the tube is wider than the picture's aspect: the framing must still hold all of it.
  const Rgb background = pixel(bent, 0, 0);
  for (int x = 0; x < options.width; ++x)
    for (int y : {0, options.height - 1}) ASSERT_EQ(pixel(bent, x, y), background) << x << ", " << y;
  for (int y = 0; y < options.height; ++y)
    for (int x : {0, options.width - 1}) ASSERT_EQ(pixel(bent, x, y), background) << x << ", " << y;
}

TEST_F(PreviewTube, WritesTheSamePictureAsPng) {
  const std::string path = ::testing::TempDir() + "tessik_preview_test.png";
  renderPreview(path, mesh, skeleton, bindPoses, weights, options);
  int width = 0, height = 0, channels = 0;
  stbi_uc* loaded = stbi_load(path.c_str(), &width, &height, &channels, 4);
  std::remove(path.c_str());
  ASSERT_NE(loaded, nullptr) << stbi_failure_reason();
  const std::vector<std::uint8_t> file(loaded, loaded + static_cast<std::size_t>(width) * height * 4);
  stbi_image_free(loaded);
  EXPECT_EQ(width, options.width);
  EXPECT_EQ(height, options.height);
  EXPECT_TRUE(file == render(mesh, bindPoses)) << "the PNG differs from the pixels, or is upside down";
}

TEST_F(PreviewTube, LeavesTheCallersGLStateAsItWas) {
  glClearColor(0.1f, 0.2f, 0.3f, 0.4f);
  glViewport(1, 2, 3, 4);
  glEnable(GL_CULL_FACE);
  render(mesh, bindPoses);
  GLfloat clear[4] = {};
  glGetFloatv(GL_COLOR_CLEAR_VALUE, clear);
  EXPECT_FLOAT_EQ(clear[2], 0.3f);
  GLint viewport[4] = {};
  glGetIntegerv(GL_VIEWPORT, viewport);
  EXPECT_EQ(viewport[2], 3);
  EXPECT_TRUE(glIsEnabled(GL_CULL_FACE));
  GLint framebuffer = -1;
  glGetIntegerv(GL_FRAMEBUFFER_BINDING, &framebuffer);
  EXPECT_EQ(framebuffer, 0);
  EXPECT_EQ(glGetError(), static_cast<GLenum>(GL_NO_ERROR));
}

TEST_F(PreviewTube, RejectsSizesAndJointListsThatDoNotFit) {
  EXPECT_THROW(renderPreviewPixels(mesh, skeleton, bindPoses, weights, PreviewOptions{15, 64}),
               std::invalid_argument);
  EXPECT_THROW(render(mesh, {bindPoses.begin(), bindPoses.end() - 1}), std::invalid_argument);
}

// Where the processor's picture strays from OpenGL's. A pixel is covered when it is not the background;
// mask faults are pixels covered in one picture only that lie more than 2 pixels from every edge of GL's
// silhouette, and colour agreement is the share of pixels covered in either picture whose channels
// differ by at most 8.
struct PictureDifference {
  int maskFaults = 0;
  double colourAgreement = 0.0;
};

PictureDifference compare(const std::vector<std::uint8_t>& gl,
                          const std::vector<std::uint8_t>& cpu,
                          int width,
                          int height) {
  const auto differ = [](const std::uint8_t* a, const std::uint8_t* b, int tolerance) {
    return std::abs(a[0] - b[0]) > tolerance || std::abs(a[1] - b[1]) > tolerance ||
           std::abs(a[2] - b[2]) > tolerance;
  };
  // The framing's margin keeps the corners clear of the figure.
  const std::uint8_t* background = gl.data();
  std::vector<char> glMask(gl.size() / 4), cpuMask(gl.size() / 4);
  for (std::size_t i = 0; i < glMask.size(); ++i) {
    glMask[i] = differ(&gl[4 * i], background, 4);
    cpuMask[i] = differ(&cpu[4 * i], background, 4);
  }
  PictureDifference d;
  int covered = 0, agreeing = 0;
  for (int y = 0; y < height; ++y)
    for (int x = 0; x < width; ++x) {
      const std::size_t i = static_cast<std::size_t>(y) * width + x;
      if (glMask[i] || cpuMask[i]) {
        ++covered;
        agreeing += differ(&gl[4 * i], &cpu[4 * i], 8) ? 0 : 1;
      }
      if (glMask[i] == cpuMask[i]) continue;
      bool nearEdge = false;
      for (int v = std::max(y - 2, 0); v <= std::min(y + 2, height - 1); ++v)
        for (int u = std::max(x - 2, 0); u <= std::min(x + 2, width - 1); ++u)
          nearEdge = nearEdge || glMask[static_cast<std::size_t>(v) * width + u] != glMask[i];
      d.maskFaults += nearEdge ? 0 : 1;
    }
  d.colourAgreement = covered > 0 ? static_cast<double>(agreeing) / covered : 0.0;
  return d;
}

struct DeviceCase {
  const char* name;
  tessik::test::PreviewInput (*make)();
  int width, height;
};

void PrintTo(const DeviceCase& c, std::ostream* os) { *os << c.name; }

class PreviewDevices : public tessik::test::GLContextTest,
                       public ::testing::WithParamInterface<DeviceCase> {};

TEST_P(PreviewDevices, CpuDrawsWhatGLDraws) {
  const DeviceCase& c = GetParam();
  const tessik::test::PreviewInput in = c.make();
  PreviewOptions options{c.width, c.height, PreviewDevice::opengl};
  const std::vector<std::uint8_t> gl =
      renderPreviewPixels(in.mesh, in.skeleton, in.jointWorld, in.weights, options);
  options.device = PreviewDevice::cpu;
  const std::vector<std::uint8_t> cpu =
      renderPreviewPixels(in.mesh, in.skeleton, in.jointWorld, in.weights, options);
  ASSERT_EQ(gl.size(), cpu.size());
  const PictureDifference d = compare(gl, cpu, c.width, c.height);
  EXPECT_EQ(d.maskFaults, 0);
  EXPECT_GE(d.colourAgreement, 0.97);
}

INSTANTIATE_TEST_SUITE_P(
    Preview,
    PreviewDevices,
    ::testing::Values(DeviceCase{"tube", tessik::test::previewTube, 256, 320},
                      DeviceCase{"character", tessik::test::previewCharacter, 400, 400},
                      DeviceCase{"bent_character",
                                 [] {
                                   tessik::test::PreviewInput in = tessik::test::previewCharacter();
                                   in.jointWorld = posedJointTransforms(in.skeleton, {{"l_elbow", 0, 0, 70}});
                                   in.mesh = deformMesh(in.mesh, in.skeleton, in.jointWorld, in.weights);
                                   return in;
                                 },
                                 320, 200}),
    [](const ::testing::TestParamInfo<DeviceCase>& info) { return std::string(info.param.name); });

}  // namespace

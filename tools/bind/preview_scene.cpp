#include "preview_scene.h"

#include <algorithm>
#include <cmath>
#include <cstddef>
#include <stdexcept>
#include <string>

#include "pose.h"

namespace tessik::bind {

namespace preview {

namespace {

constexpr int kMinSize = 16;
constexpr int kMaxSize = 8192;
// Drawing at twice the size and averaging 2x2 blocks smooths silhouettes and the skeleton's edges without
// multisampled framebuffers, which a GL 2.1 context may lack. Past this many output pixels the
// supersampled buffer (four times as large) would cost more memory than the smoothing is worth.
constexpr int kSupersample = 2;
constexpr long long kMaxSupersampledPixels = 2048LL * 2048LL;
constexpr double kMargin = 0.1;  // of the framed half-size, on every side
constexpr float kAmbient = 0.35f;
constexpr Vec3f kUnweighted = {0.6f, 0.6f, 0.6f};
constexpr Vec3f kBoneColour = {1.0f, 1.0f, 1.0f};
constexpr Vec3f kOutlineColour = {0.05f, 0.05f, 0.05f};
// The skeleton's marks in output pixels for an 800-pixel picture, scaled with it, but never so thin that
// the white bar blurs into its outline.
constexpr double kBoneHalfWidth = 2.0, kMinBoneHalfWidth = 1.0;
constexpr double kOutline = 1.5, kMinOutline = 1.0;
constexpr double kDotRadius = 5.0, kMinDotRadius = 2.5;
constexpr int kDotSegments = 24;

// Light from the upper left and in front, fixed to the camera.
Vec3f lightDirection() {
  const float x = -0.4f, y = 0.5f, z = 0.77f;
  const float length = std::sqrt(x * x + y * y + z * z);
  return {x / length, y / length, z / length};
}

void checkSize(const PreviewOptions& options) {
  for (int size : {options.width, options.height})
    if (size < kMinSize || size > kMaxSize)
      throw std::invalid_argument("the preview size " + std::to_string(options.width) + "x" +
                                  std::to_string(options.height) + " is outside " + std::to_string(kMinSize) +
                                  " to " + std::to_string(kMaxSize) + " pixels");
}

Framing frame(const SurfaceMesh& mesh, const std::vector<Mat4>& jointWorld, int width, int height) {
  std::array<double, 3> lo = {HUGE_VAL, HUGE_VAL, HUGE_VAL};
  std::array<double, 3> hi = {-HUGE_VAL, -HUGE_VAL, -HUGE_VAL};
  auto grow = [&](const Vec3f& p) {
    for (int k = 0; k < 3; ++k) {
      lo[k] = std::min(lo[k], static_cast<double>(p[k]));
      hi[k] = std::max(hi[k], static_cast<double>(p[k]));
    }
  };
  for (const Vec3f& p : mesh.positions) grow(p);
  for (const Mat4& m : jointWorld) grow(translationOf(m));
  if (lo[0] > hi[0]) {
    lo = {-1.0, -1.0, -1.0};
    hi = {1.0, 1.0, 1.0};
  }

  // A flat or single-point scene still needs a view of some size.
  double extent = std::max({hi[0] - lo[0], hi[1] - lo[1], hi[2] - lo[2]}) / 2.0;
  if (!(extent > 0.0)) extent = 1.0;
  const double halfX = std::max((hi[0] - lo[0]) / 2.0, 1e-3 * extent);
  const double halfY = std::max((hi[1] - lo[1]) / 2.0, 1e-3 * extent);
  const double aspect = static_cast<double>(width) / height;
  const double halfHeight = std::max(halfY, halfX / aspect) * (1.0 + kMargin);
  const double halfWidth = halfHeight * aspect;
  const double cx = (lo[0] + hi[0]) / 2.0, cy = (lo[1] + hi[1]) / 2.0;
  const double pad = 0.1 * extent;
  return {cx - halfWidth, cx + halfWidth, cy - halfHeight,       cy + halfHeight,
          -(hi[2] + pad), -(lo[2] - pad), (lo[2] + hi[2]) / 2.0, 2.0 * halfHeight / height};
}

std::vector<Vec3f> shadedColours(const SurfaceMesh& mesh, const VertexWeights& weights) {
  const std::vector<Vec3f> computed =
      mesh.normals.empty() ? smoothNormals(mesh.positions, mesh.triangles) : std::vector<Vec3f>();
  const std::vector<Vec3f>& normals = mesh.normals.empty() ? computed : mesh.normals;
  const Vec3f light = lightDirection();
  std::vector<Vec3f> colours(mesh.positions.size());
  for (std::size_t v = 0; v < colours.size(); ++v) {
    Vec3f sum = {0.0f, 0.0f, 0.0f};
    float total = 0.0f;
    for (std::uint32_t i = weights.begin(v); i < weights.end(v); ++i) {
      const Influence& influence = weights.influences[i];
      const Vec3f c = jointColour(influence.bone);
      for (int k = 0; k < 3; ++k) sum[k] += influence.weight * c[k];
      total += influence.weight;
    }
    Vec3f base = kUnweighted;
    if (total > 0.0f) base = {sum[0] / total, sum[1] / total, sum[2] / total};
    const Vec3f& n = normals[v];
    // |n . l| lights both faces alike, so a surface whose normals point inward does not go black.
    const float diffuse = std::fabs(n[0] * light[0] + n[1] * light[1] + n[2] * light[2]);
    const float shade = kAmbient + (1.0f - kAmbient) * std::min(diffuse, 1.0f);
    colours[v] = {base[0] * shade, base[1] * shade, base[2] * shade};
  }
  return colours;
}

// Bars and dots as triangles in the view plane, sized in pixels: wide lines and large points are
// optional in GL and clamp to small limits on some drivers, and triangles fill alike on every path.
std::vector<FlatLayer> skeletonLayers(const Skeleton& skeleton,
                                      const std::vector<Mat4>& jointWorld,
                                      const Framing& framing,
                                      double pixelScale) {
  const double unit = framing.unitsPerPixel;
  const double halfWidth = std::max(kBoneHalfWidth * pixelScale, kMinBoneHalfWidth) * unit;
  const double outline = std::max(kOutline * pixelScale, kMinOutline) * unit;
  const double radius = std::max(kDotRadius * pixelScale, kMinDotRadius) * unit;
  auto bars = [&](double half, std::vector<std::array<double, 2>>& out) {
    for (std::size_t j = 0; j < skeleton.joints.size(); ++j) {
      if (skeleton.joints[j].parent < 0) continue;
      const Vec3f a = translationOf(jointWorld[static_cast<std::size_t>(skeleton.joints[j].parent)]);
      const Vec3f b = translationOf(jointWorld[j]);
      const double dx = b[0] - a[0], dy = b[1] - a[1];
      const double length = std::hypot(dx, dy);
      if (!(length > 0.0)) continue;  // a bone along the view axis shows as its dots alone
      const double px = -dy / length * half, py = dx / length * half;
      out.insert(out.end(), {{a[0] + px, a[1] + py},
                             {a[0] - px, a[1] - py},
                             {b[0] - px, b[1] - py},
                             {a[0] + px, a[1] + py},
                             {b[0] - px, b[1] - py},
                             {b[0] + px, b[1] + py}});
    }
  };
  auto dots = [&](double r, std::vector<std::array<double, 2>>& out) {
    constexpr double kTwoPi = 6.28318530717958647692;
    for (const Mat4& m : jointWorld) {
      const Vec3f c = translationOf(m);
      for (int s = 0; s < kDotSegments; ++s) {
        const double a0 = kTwoPi * s / kDotSegments, a1 = kTwoPi * (s + 1) / kDotSegments;
        out.insert(out.end(), {{c[0], c[1]},
                               {c[0] + r * std::cos(a0), c[1] + r * std::sin(a0)},
                               {c[0] + r * std::cos(a1), c[1] + r * std::sin(a1)}});
      }
    }
  };
  // Every outline first, so no outline cuts across another bone's white.
  std::vector<FlatLayer> layers = {{kOutlineColour, {}}, {kBoneColour, {}}};
  bars(halfWidth + outline, layers[0].corners);
  dots(radius + outline, layers[0].corners);
  bars(halfWidth, layers[1].corners);
  dots(radius, layers[1].corners);
  return layers;
}

// The factor as a constant lets the compiler unroll the block sums; this runs over every sample.
// `samples` starts at the first sample row of output row y (counted from the bottom).
template <int kFactor>
void downsampleRowFlipped(const std::uint8_t* samples, int width, int height, int y, std::uint8_t* pixels) {
  constexpr int kSamples = kFactor * kFactor;
  const std::size_t sampleWidth = static_cast<std::size_t>(width) * kFactor;
  std::uint8_t* out = pixels + static_cast<std::size_t>(height - 1 - y) * width * 4;
  for (int x = 0; x < width; ++x)
    for (int c = 0; c < 4; ++c) {
      int sum = 0;
      for (int dy = 0; dy < kFactor; ++dy)
        for (int dx = 0; dx < kFactor; ++dx) sum += samples[(dy * sampleWidth + x * kFactor + dx) * 4 + c];
      out[x * 4 + c] = static_cast<std::uint8_t>((sum + kSamples / 2) / kSamples);
    }
}

}  // namespace

Scene makeScene(const SurfaceMesh& mesh,
                const Skeleton& skeleton,
                const std::vector<Mat4>& jointWorld,
                const VertexWeights& weights,
                const PreviewOptions& options) {
  checkSize(options);
  checkSkinInputs(mesh, skeleton, jointWorld, weights);
  Scene scene;
  scene.width = options.width;
  scene.height = options.height;
  scene.framing = frame(mesh, jointWorld, options.width, options.height);
  scene.vertexColours = shadedColours(mesh, weights);
  scene.skeleton =
      skeletonLayers(skeleton, jointWorld, scene.framing, std::min(options.width, options.height) / 800.0);
  return scene;
}

int supersampleFactor(int width, int height, int maxSide) {
  return std::max(width, height) <= maxSide / kSupersample &&
                 static_cast<long long>(width) * height <= kMaxSupersampledPixels
             ? kSupersample
             : 1;
}

std::vector<std::uint8_t> downsampleFlipped(const std::vector<std::uint8_t>& big,
                                            int width,
                                            int height,
                                            int factor) {
  std::vector<std::uint8_t> pixels(static_cast<std::size_t>(width) * height * 4);
  const std::size_t sampleRow = static_cast<std::size_t>(width) * factor * 4;
#pragma omp parallel for schedule(static)
  for (int y = 0; y < height; ++y)
    downsampleRowsFlipped(&big[y * factor * sampleRow], width, height, factor, y, y + 1, pixels.data());
  return pixels;
}

void downsampleRowsFlipped(const std::uint8_t* samples,
                           int width,
                           int height,
                           int factor,
                           int rowBegin,
                           int rowEnd,
                           std::uint8_t* pixels) {
  const std::size_t sampleRows = static_cast<std::size_t>(width) * factor * factor * 4;  // per output row
  for (int y = rowBegin; y < rowEnd; ++y) {
    const std::uint8_t* row = samples + (y - rowBegin) * sampleRows;
    if (factor == kSupersample)
      downsampleRowFlipped<kSupersample>(row, width, height, y, pixels);
    else
      downsampleRowFlipped<1>(row, width, height, y, pixels);
  }
}

}  // namespace preview

Vec3f jointColour(std::uint32_t joint) {
  constexpr double kGoldenRatioConjugate = 0.61803398874989484820;
  constexpr double kSaturation = 0.7, kValue = 0.95;
  const double hue = std::fmod(joint * kGoldenRatioConjugate, 1.0) * 6.0;
  const int sector = static_cast<int>(hue) % 6;
  const double f = hue - std::floor(hue);
  const auto p = static_cast<float>(kValue * (1.0 - kSaturation));
  const auto q = static_cast<float>(kValue * (1.0 - kSaturation * f));
  const auto t = static_cast<float>(kValue * (1.0 - kSaturation * (1.0 - f)));
  const auto v = static_cast<float>(kValue);
  switch (sector) {
    case 0:
      return {v, t, p};
    case 1:
      return {q, v, p};
    case 2:
      return {p, v, t};
    case 3:
      return {p, q, v};
    case 4:
      return {t, p, v};
    default:
      return {v, p, q};
  }
}

}  // namespace tessik::bind

#pragma once

#include <array>
#include <cstdint>
#include <vector>

#include "asset.h"
#include "preview.h"

// What the preview shows, worked out without any graphics API, so that the OpenGL drawing and the
// processor's drawing place, colour and shade everything alike. Internal to the tool.
namespace tessik::bind::preview {

constexpr Vec3f kBackground = {0.13f, 0.14f, 0.16f};

// What the orthographic camera sees, in mesh units. The eye looks down -Z from the origin, so zNear and
// zFar are distances along -Z, as glOrtho takes them.
struct Framing {
  double left, right, bottom, top, zNear, zFar;
  double midZ;
  double unitsPerPixel;  // of the output picture
};

// Triangles of one colour in the plane z = Framing::midZ, corners in mesh units, three per triangle.
struct FlatLayer {
  Vec3f colour;
  std::vector<std::array<double, 2>> corners;
};

// Everything both drawings need, from inputs that fit together.
struct Scene {
  int width = 0, height = 0;  // of the output picture
  Framing framing{};
  std::vector<Vec3f> vertexColours;  // shaded, one per mesh position
  // The skeleton, to be painted in this order over the mesh with no depth test.
  std::vector<FlatLayer> skeleton;
};

// Throws std::invalid_argument for a size outside [16, 8192] or inputs checkSkinInputs rejects.
Scene makeScene(const SurfaceMesh& mesh,
                const Skeleton& skeleton,
                const std::vector<Mat4>& jointWorld,
                const VertexWeights& weights,
                const PreviewOptions& options);

// How many samples a side each output pixel is drawn with (1 or 2), when a side of the drawing may be at
// most `maxSide` samples long.
int supersampleFactor(int width, int height, int maxSide);

// The output picture (RGBA8, top row first) from a drawing `factor` times its size whose rows run bottom
// to top, as GL reads them back: each pixel is the rounded mean of its factor x factor block.
std::vector<std::uint8_t> downsampleFlipped(const std::vector<std::uint8_t>& big,
                                            int width,
                                            int height,
                                            int factor);

// The same for output rows [rowBegin, rowEnd) only, counted from the bottom, from `samples`, which
// starts at the first sample row of output row rowBegin; writes them into `pixels`, the whole
// width * height * 4 byte picture. Lets a drawing average each band of samples while it is in cache.
void downsampleRowsFlipped(const std::uint8_t* samples,
                           int width,
                           int height,
                           int factor,
                           int rowBegin,
                           int rowEnd,
                           std::uint8_t* pixels);

}  // namespace tessik::bind::preview

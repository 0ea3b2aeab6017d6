#include "preview_raster.h"

#include <algorithm>
#include <array>
#include <climits>
#include <cmath>
#include <cstddef>
#include <cstring>

namespace tessik::bind::preview {

namespace {

// Rows of samples per band: small enough that the bands of an 800-pixel picture outnumber the threads
// many times over (the figure is rarely spread evenly down the picture), large enough that a triangle
// seldom straddles two bands and is set up twice.
constexpr int kBandRows = 8;
static_assert(kBandRows % 2 == 0, "a band holds whole rows of supersampled pixels");

using Point = std::array<double, 2>;  // window coordinates: samples from the lower left corner

std::uint8_t toUnorm8(float c) {
  return static_cast<std::uint8_t>(std::min(std::max(c, 0.0f), 1.0f) * 255.0f + 0.5f);
}

// The colour and depth samples of one band of rows, bottom to top as GL keeps them. Each thread reuses
// one for every band it draws: a whole supersampled picture would be tens of megabytes to page in and
// zero, and freeing it costs every core a TLB flush.
struct Band {
  std::vector<std::uint8_t> colour;  // RGBA8
  std::vector<float> depth;          // 0 at the near plane, 1 at the far one
};

// One edge a -> b of a counter-clockwise triangle as e(p) = A x + B y + C, positive on the inside. Where
// e is zero the sample goes to the triangle on whose side A (then B) is positive: a shared edge has
// opposite coefficients in its two triangles, so exactly one of them takes the sample.
struct Edge {
  double a, b, c;
  bool takesTies;
  bool covers(double e) const { return e > 0.0 || (e == 0.0 && takesTies); }
};

Edge edge(const Point& from, const Point& to, double sign) {
  const double a = sign * (from[1] - to[1]), b = sign * (to[0] - from[0]);
  return {a, b, -(a * from[0] + b * from[1]), a > 0.0 || (a == 0.0 && b > 0.0)};
}

// Calls plot(index, l) for each sample of rows [rowBegin, rowEnd) whose centre the triangle covers, in
// row then column order; l holds the sample's barycentric weights of corners 0, 1 and 2.
template <class Plot>
void coverTriangle(const std::array<Point, 3>& p, int width, int rowBegin, int rowEnd, Plot&& plot) {
  // Sample centres sit at half-integers: the first column at or right of the leftmost corner and so on.
  // Most triangles miss most bands, so this test comes before any setup.
  const auto [yLo, yHi] = std::minmax({p[0][1], p[1][1], p[2][1]});
  const int y0 = static_cast<int>(std::max(std::ceil(yLo - 0.5), static_cast<double>(rowBegin)));
  const int y1 = static_cast<int>(std::min(std::floor(yHi - 0.5), rowEnd - 1.0));
  if (y0 > y1) return;
  const auto [xLo, xHi] = std::minmax({p[0][0], p[1][0], p[2][0]});
  const int x0 = static_cast<int>(std::max(std::ceil(xLo - 0.5), 0.0));
  const int x1 = static_cast<int>(std::min(std::floor(xHi - 0.5), width - 1.0));
  if (x0 > x1) return;
  const double area = (p[1][0] - p[0][0]) * (p[2][1] - p[0][1]) - (p[2][0] - p[0][0]) * (p[1][1] - p[0][1]);
  if (!(area != 0.0) || !std::isfinite(area)) return;  // edge-on: GL draws nothing of it either
  const double sign = area > 0.0 ? 1.0 : -1.0;         // both faces are drawn
  const std::array<Edge, 3> edges = {edge(p[1], p[2], sign), edge(p[2], p[0], sign), edge(p[0], p[1], sign)};
  const double inverseArea = 1.0 / std::fabs(area);
  for (int y = y0; y <= y1; ++y) {
    const double cy = y + 0.5;
    const double r0 = edges[0].b * cy + edges[0].c, r1 = edges[1].b * cy + edges[1].c,
                 r2 = edges[2].b * cy + edges[2].c;
    const std::size_t row = static_cast<std::size_t>(y) * width;
    for (int x = x0; x <= x1; ++x) {
      const double cx = x + 0.5;
      const double e0 = edges[0].a * cx + r0, e1 = edges[1].a * cx + r1, e2 = edges[2].a * cx + r2;
      if (edges[0].covers(e0) && edges[1].covers(e1) && edges[2].covers(e2))
        plot(row + x, std::array<double, 3>{e0 * inverseArea, e1 * inverseArea, e2 * inverseArea});
    }
  }
}

// The glOrtho and viewport transforms of the OpenGL path, from mesh units to window coordinates and depth.
struct Viewport {
  double scaleX, scaleY, left, bottom, depthScale, nearZ;

  Viewport(const Framing& f, int width, int height)
      : scaleX(width / (f.right - f.left)),
        scaleY(height / (f.top - f.bottom)),
        left(f.left),
        bottom(f.bottom),
        depthScale(1.0 / (f.zFar - f.zNear)),
        nearZ(-f.zNear) {}

  Point window(double x, double y) const { return {(x - left) * scaleX, (y - bottom) * scaleY}; }
  float depth(double z) const { return static_cast<float>((nearZ - z) * depthScale); }
};

// The row bands each triangle reaches, as one list per band in drawing order.
std::vector<std::vector<std::uint32_t>> binByBand(const std::vector<Point>& window,
                                                  const SurfaceMesh& mesh,
                                                  int bands,
                                                  int height) {
  std::vector<std::vector<std::uint32_t>> bins(static_cast<std::size_t>(bands));
  for (std::size_t t = 0; t < mesh.triangles.size(); ++t) {
    const auto& tri = mesh.triangles[t];
    const auto [lo, hi] = std::minmax({window[tri[0]][1], window[tri[1]][1], window[tri[2]][1]});
    const double first = std::max(std::ceil(lo - 0.5), 0.0),
                 last = std::min(std::floor(hi - 0.5), height - 1.0);
    if (!(first <= last)) continue;
    for (int band = static_cast<int>(first) / kBandRows; band <= static_cast<int>(last) / kBandRows; ++band)
      bins[static_cast<std::size_t>(band)].push_back(static_cast<std::uint32_t>(t));
  }
  return bins;
}

}  // namespace

std::vector<std::uint8_t> rasterizeScene(const SurfaceMesh& mesh, const Scene& scene) {
  const int factor = supersampleFactor(scene.width, scene.height, INT_MAX);
  const int sampleWidth = scene.width * factor, sampleHeight = scene.height * factor;
  const Viewport viewport(scene.framing, sampleWidth, sampleHeight);

  // Serial: a few operations per vertex cost less than another parallel region's barrier.
  std::vector<Point> window(mesh.positions.size());
  std::vector<float> depth(mesh.positions.size());
  std::vector<std::array<float, 4>> colour(mesh.positions.size());
  for (std::size_t v = 0; v < mesh.positions.size(); ++v) {
    const Vec3f& p = mesh.positions[v];
    const Vec3f& c = scene.vertexColours[v];
    window[v] = viewport.window(p[0], p[1]);
    depth[v] = viewport.depth(p[2]);
    colour[v] = {c[0], c[1], c[2], 1.0f};
  }
  const int bands = (sampleHeight + kBandRows - 1) / kBandRows;
  const std::vector<std::vector<std::uint32_t>> bins = binByBand(window, mesh, bands, sampleHeight);

  std::vector<std::array<Point, 3>> flat;  // the skeleton's triangles, in painting order
  std::vector<std::array<std::uint8_t, 4>> flatColour;
  for (const FlatLayer& layer : scene.skeleton) {
    const std::array<std::uint8_t, 4> rgba = {toUnorm8(layer.colour[0]), toUnorm8(layer.colour[1]),
                                              toUnorm8(layer.colour[2]), 255};
    for (std::size_t i = 0; i + 2 < layer.corners.size(); i += 3) {
      flat.push_back({viewport.window(layer.corners[i][0], layer.corners[i][1]),
                      viewport.window(layer.corners[i + 1][0], layer.corners[i + 1][1]),
                      viewport.window(layer.corners[i + 2][0], layer.corners[i + 2][1])});
      flatColour.push_back(rgba);
    }
  }

  std::vector<std::uint8_t> pixels(static_cast<std::size_t>(scene.width) * scene.height * 4);
  const std::array<std::uint8_t, 4> background = {toUnorm8(kBackground[0]), toUnorm8(kBackground[1]),
                                                  toUnorm8(kBackground[2]), 255};
  // Each band clears, fills, paints and averages only its own rows, so no sample or pixel is ever touched
  // by two threads and which thread takes a band changes nothing. Bands are handed out as threads come
  // free: on cores shared with other work a fixed split leaves every thread waiting for the slowest.
#pragma omp parallel
  {
    Band target{std::vector<std::uint8_t>(static_cast<std::size_t>(sampleWidth) * kBandRows * 4),
                std::vector<float>(static_cast<std::size_t>(sampleWidth) * kBandRows)};
#pragma omp for schedule(dynamic, 1)
    for (int band = 0; band < bands; ++band) {
      const int rowBegin = band * kBandRows, rowEnd = std::min(rowBegin + kBandRows, sampleHeight);
      // Sample indices arrive counted from the picture's first row; the band holds its own rows only.
      const std::size_t first = static_cast<std::size_t>(rowBegin) * sampleWidth;
      const std::size_t count = static_cast<std::size_t>(rowEnd - rowBegin) * sampleWidth;
      for (std::size_t s = 0; s < count; ++s) std::memcpy(&target.colour[4 * s], background.data(), 4);
      std::fill(target.depth.begin(), target.depth.begin() + static_cast<std::ptrdiff_t>(count), 1.0f);
      for (std::uint32_t t : bins[static_cast<std::size_t>(band)]) {
        const auto& tri = mesh.triangles[t];
        const std::array<Point, 3> corners = {window[tri[0]], window[tri[1]], window[tri[2]]};
        coverTriangle(
            corners, sampleWidth, rowBegin, rowEnd, [&](std::size_t at, const std::array<double, 3>& l) {
              const std::size_t s = at - first;
              const float z =
                  static_cast<float>(l[0] * depth[tri[0]] + l[1] * depth[tri[1]] + l[2] * depth[tri[2]]);
              // Outside [0, 1] GL clips the sample away; otherwise the first drawn of equal depths stays.
              if (!(z >= 0.0f && z <= 1.0f && z < target.depth[s])) return;
              target.depth[s] = z;
              for (int k = 0; k < 4; ++k)
                target.colour[4 * s + k] = toUnorm8(static_cast<float>(
                    l[0] * colour[tri[0]][k] + l[1] * colour[tri[1]][k] + l[2] * colour[tri[2]][k]));
            });
      }
      for (std::size_t f = 0; f < flat.size(); ++f)
        coverTriangle(flat[f], sampleWidth, rowBegin, rowEnd,
                      [&](std::size_t at, const std::array<double, 3>&) {
                        std::memcpy(&target.colour[4 * (at - first)], flatColour[f].data(), 4);
                      });
      downsampleRowsFlipped(target.colour.data(), scene.width, scene.height, factor, rowBegin / factor,
                            rowEnd / factor, pixels.data());
    }
  }
  return pixels;
}

}  // namespace tessik::bind::preview

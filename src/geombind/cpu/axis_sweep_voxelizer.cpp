#include "geombind/cpu/axis_sweep_voxelizer.h"

#include <algorithm>
#include <array>
#include <cmath>
#include <cstdint>
#include <vector>

#include "geombind/parallel.h"

namespace TessikSDK::GeomBind::Cpu {

namespace {

using Point2 = std::array<double, 2>;

// A triangle crossing one ray: the texel it covers within its row, where along the sweep axis, and
// whether its outward normal points along +axis (+1) or -axis (-1).
struct Crossing {
  std::uint32_t ray;
  std::int32_t facing;
  double depth;
};

// Sorted by ray, then depth; at equal depth the +axis facing first. A surface a sweep reaches at the
// same depth as another then wins when it is a back face, in both directions: the GPU draws the back
// faces first and a later fragment at equal depth fails its less-than depth test.
bool operator<(const Crossing& l, const Crossing& r) {
  if (l.ray != r.ray) return l.ray < r.ray;
  if (l.depth != r.depth) return l.depth < r.depth;
  return l.facing > r.facing;
}

double cross2(const Point2& u, const Point2& v) { return u[0] * v[1] - u[1] * v[0]; }

// Edge function of p against the edge from a to b (positive on its left). A shared edge is always
// evaluated from the same endpoint in the same direction, so the two triangles on either side get
// exactly opposite values and a point on the edge can go to exactly one of them.
double edgeFunction(const Point2& a, const Point2& b, const Point2& p) {
  if (a < b) return cross2({b[0] - a[0], b[1] - a[1]}, {p[0] - a[0], p[1] - a[1]});
  return -cross2({a[0] - b[0], a[1] - b[1]}, {p[0] - b[0], p[1] - b[1]});
}

// Top-left style tie rule for a point on an edge whose direction is `d` once the triangle is turned
// counter-clockwise: of an edge and its reverse exactly one owns the points on it.
bool ownsEdge(const Point2& d) { return d[1] < 0.0 || (d[1] == 0.0 && d[0] > 0.0); }

// The sweep axis `a`; rays run along `b` inside one row, rows along `c`. The row is the slowest of the
// three cell strides it can be, so a row's writes stay in a small part of the vote grid.
struct AxisFrame {
  int a, b, c;
  double facingSign;  // +1 when (a, b, c) is a cyclic order of (x, y, z): the 2D cross gives n.a
};

constexpr AxisFrame kFrames[3] = {{0, 1, 2, 1.0}, {1, 0, 2, -1.0}, {2, 0, 1, 1.0}};

// The mesh in the frame the GPU renders it in: centred on the grid box with the centre rounded to
// single precision, positions subtracted in single precision, the box in single precision.
struct CentredMesh {
  std::vector<std::array<float, 3>> positions;
  std::array<float, 3> lower{}, upper{};
  std::array<double, 3> meshLower{}, meshUpper{};
};

CentredMesh centre(const MeshData& mesh) {
  const glm::dvec3 c = (mesh.boundingBox.lower + mesh.boundingBox.upper) * 0.5;
  const float cf[3] = {static_cast<float>(c.x), static_cast<float>(c.y), static_cast<float>(c.z)};
  CentredMesh out;
  out.positions.reserve(mesh.vertices.size());
  out.meshLower.fill(HUGE_VAL);
  out.meshUpper.fill(-HUGE_VAL);
  for (const VertexRecord& v : mesh.vertices) {
    std::array<float, 3> p;
    for (int k = 0; k < 3; ++k) {
      p[k] = v.position[k] - cf[k];
      out.meshLower[k] = std::min(out.meshLower[k], double{p[k]});
      out.meshUpper[k] = std::max(out.meshUpper[k], double{p[k]});
    }
    out.positions.push_back(p);
  }
  for (int k = 0; k < 3; ++k) {
    out.lower[k] = static_cast<float>(mesh.boundingBox.lower[k] - c[k]);
    out.upper[k] = static_cast<float>(mesh.boundingBox.upper[k] - c[k]);
  }
  return out;
}

// Slice positions of one sweep, in the single-precision steps the GPU takes; they move monotonically,
// so the slices the GPU renders (those within the mesh's extent) are one run [first, end). Slice s
// samples voxel layer n - 1 - s descending and layer s ascending.
struct Slices {
  std::vector<double> position;
  std::uint32_t first = 0, end = 0;
};

Slices slicePositions(const CentredMesh& m, int axis, std::uint32_t n, bool ascending) {
  const float step = (m.upper[axis] - m.lower[axis]) / static_cast<float>(n);
  float position = ascending ? m.lower[axis] : m.upper[axis];
  Slices out;
  out.position.resize(n);
  bool started = false;
  for (std::uint32_t s = 0; s < n; ++s) {
    position = ascending ? position + step : position - step;
    const double at = position;
    out.position[s] = at;
    if (at < m.meshLower[axis] || at > m.meshUpper[axis]) continue;
    if (!started) out.first = s;
    started = true;
    out.end = s + 1;
  }
  return out;
}

// The slices of [first, end) for which `before` holds form a prefix; where it ends.
template <class Before>
std::uint32_t partitionPoint(const Slices& slices, Before before) {
  const auto begin = slices.position.begin();
  return static_cast<std::uint32_t>(std::partition_point(begin + slices.first, begin + slices.end, before) -
                                    begin);
}

// Texel centres along one axis of a sweep's image: the voxel centres of the centred box.
std::vector<double> texelCentres(const CentredMesh& m, int axis, std::uint32_t n) {
  const double size = (double{m.upper[axis]} - m.lower[axis]) / n;
  std::vector<double> out(n);
  for (std::uint32_t i = 0; i < n; ++i) out[i] = m.lower[axis] + (i + 0.5) * size;
  return out;
}

// Index range [first, last] of the centres that lie in [lo, hi]; false when there are none. The
// estimate from the spacing is settled against the centres themselves, so rounding cannot drop one.
bool centreRange(
    const std::vector<double>& centres, double lo, double hi, std::uint32_t& first, std::uint32_t& last) {
  const auto n = static_cast<std::int64_t>(centres.size());
  if (n == 0 || hi < centres[0] || lo > centres[n - 1]) return false;
  const double origin = centres[0], size = n > 1 ? centres[1] - centres[0] : 1.0;
  auto f = std::clamp<std::int64_t>(static_cast<std::int64_t>(std::ceil((lo - origin) / size)), 0, n - 1);
  while (f > 0 && centres[f - 1] >= lo) --f;
  while (f < n && centres[f] < lo) ++f;
  auto l = std::clamp<std::int64_t>(static_cast<std::int64_t>(std::floor((hi - origin) / size)), 0, n - 1);
  while (l + 1 < n && centres[l + 1] <= hi) ++l;
  while (l >= 0 && centres[l] > hi) --l;
  if (f > l) return false;
  first = static_cast<std::uint32_t>(f);
  last = static_cast<std::uint32_t>(l);
  return true;
}

struct Projected {
  Point2 p[3];
  double depth[3];
  double orient;  // +1 when counter-clockwise in (b, c)
  std::int32_t facing;
};

// The triangle seen along the frame's axis; false when it projects to no area (the GPU rasterises
// nothing for an edge-on triangle).
bool project(const CentredMesh& m, const TriangleRecord& t, const AxisFrame& f, Projected& out) {
  for (int v = 0; v < 3; ++v) {
    const auto& q = m.positions[t[v]];
    out.p[v] = {q[f.b], q[f.c]};
    out.depth[v] = q[f.a];
  }
  if (out.p[0] == out.p[1] || out.p[1] == out.p[2] || out.p[2] == out.p[0]) return false;
  const double area = edgeFunction(out.p[0], out.p[1], out.p[2]);
  if (area == 0.0) return false;
  out.orient = area > 0.0 ? 1.0 : -1.0;
  out.facing = area * f.facingSign > 0.0 ? 1 : -1;
  return true;
}

// Whether the ray through `q` crosses the triangle, and where along the axis.
bool crossing(const Projected& t, const Point2& q, double& depth) {
  double w[3];
  double sum = 0.0;
  for (int v = 0; v < 3; ++v) {
    const Point2& from = t.p[(v + 1) % 3];
    const Point2& to = t.p[(v + 2) % 3];
    w[v] = edgeFunction(from, to, q) * t.orient;
    if (w[v] < 0.0) return false;
    if (w[v] == 0.0) {
      const Point2 d = {(to[0] - from[0]) * t.orient, (to[1] - from[1]) * t.orient};
      if (!ownsEdge(d)) return false;
    }
    sum += w[v];
  }
  if (sum <= 0.0) return false;
  depth = (w[0] * t.depth[0] + w[1] * t.depth[1] + w[2] * t.depth[2]) / sum;
  return true;
}

void sweepAxis(IProgress& progress,
               const MeshData& mesh,
               const CentredMesh& m,
               const AxisFrame& f,
               AxisVoteGrid& votes,
               int threads) {
  const std::array<std::uint32_t, 3>& dims = votes.dims;
  const std::uint32_t na = dims[f.a], nb = dims[f.b], nc = dims[f.c];
  if (na == 0 || nb == 0 || nc == 0) return;
  const Slices descending = slicePositions(m, f.a, na, false);
  const Slices ascending = slicePositions(m, f.a, na, true);
  const std::vector<double> rayB = texelCentres(m, f.b, nb);
  const std::vector<double> rowC = texelCentres(m, f.c, nc);

  // Triangles binned by the rows of rays their projection may reach (counting sort into one array).
  std::vector<Projected> projected(mesh.triangles.size());
  std::vector<std::uint8_t> visible(mesh.triangles.size(), 0);
  std::vector<std::array<std::uint32_t, 2>> rows(mesh.triangles.size());
  std::vector<std::uint32_t> rowStart(std::size_t{nc} + 1, 0);
  for (std::size_t t = 0; t < mesh.triangles.size(); ++t) {
    Projected& p = projected[t];
    if (!project(m, mesh.triangles[t], f, p)) continue;
    const double lo = std::min({p.p[0][1], p.p[1][1], p.p[2][1]});
    const double hi = std::max({p.p[0][1], p.p[1][1], p.p[2][1]});
    if (!centreRange(rowC, lo, hi, rows[t][0], rows[t][1])) continue;
    visible[t] = 1;
    for (std::uint32_t k = rows[t][0]; k <= rows[t][1]; ++k) ++rowStart[k + 1];
  }
  for (std::uint32_t k = 0; k < nc; ++k) rowStart[k + 1] += rowStart[k];
  std::vector<std::uint32_t> binned(rowStart[nc]);
  {
    std::vector<std::uint32_t> fill(rowStart.begin(), rowStart.end() - 1);
    for (std::size_t t = 0; t < mesh.triangles.size(); ++t) {
      if (visible[t] == 0) continue;
      for (std::uint32_t k = rows[t][0]; k <= rows[t][1]; ++k)
        binned[fill[k]++] = static_cast<std::uint32_t>(t);
    }
  }

  const std::uint64_t stride[3] = {1, dims[0], std::uint64_t{dims[0]} * dims[1]};
  const std::uint8_t descendFlag = static_cast<std::uint8_t>(1u << (2 * f.a));
  const std::uint8_t ascendFlag = static_cast<std::uint8_t>(2u << (2 * f.a));
  std::uint8_t* const grid = votes.votes.data();
  const auto rowCount = static_cast<std::int64_t>(nc);

  // Every row writes only the voxels of its own layer along c, so rows are independent and the
  // votes come out the same however they are shared among threads. Rows are dealt out one at a time
  // because the mesh fills some far more than others.
#pragma omp parallel num_threads(threads)
  {
    std::vector<Crossing> crossings;
#pragma omp for schedule(static, 1)
    for (std::int64_t row = 0; row < rowCount; ++row) {
      if (progress.isCanceled()) continue;
      const auto k = static_cast<std::uint32_t>(row);
      crossings.clear();
      for (std::uint32_t e = rowStart[k]; e < rowStart[k + 1]; ++e) {
        const Projected& t = projected[binned[e]];
        const double lo = std::min({t.p[0][0], t.p[1][0], t.p[2][0]});
        const double hi = std::max({t.p[0][0], t.p[1][0], t.p[2][0]});
        std::uint32_t first, last;
        if (!centreRange(rayB, lo, hi, first, last)) continue;
        for (std::uint32_t j = first; j <= last; ++j) {
          double depth;
          if (crossing(t, {rayB[j], rowC[k]}, depth)) crossings.push_back({j, t.facing, depth});
        }
      }
      std::sort(crossings.begin(), crossings.end());

      for (std::size_t begin = 0; begin < crossings.size();) {
        const std::uint32_t j = crossings[begin].ray;
        std::size_t end = begin;
        while (end < crossings.size() && crossings[end].ray == j) ++end;
        const std::uint64_t base = j * stride[f.b] + k * stride[f.c];
        // Looking toward -a, a slice sees the last crossing at or below it: crossing i for positions in
        // [depth i, depth i + 1), a run of slices since the positions fall with s. Among crossings at
        // equal depth the last one wins, and the runs of the others are empty.
        for (std::size_t i = begin; i < end; ++i) {
          if (crossings[i].facing > 0) continue;
          const double from = crossings[i].depth;
          const double to = i + 1 < end ? crossings[i + 1].depth : HUGE_VAL;
          const std::uint32_t lo = partitionPoint(descending, [to](double p) { return p >= to; });
          const std::uint32_t hi = partitionPoint(descending, [from](double p) { return p >= from; });
          for (std::uint32_t s = lo; s < hi; ++s) grid[base + (na - 1 - s) * stride[f.a]] |= descendFlag;
        }
        // Looking toward +a, the first crossing at or above: crossing i for positions in (depth i - 1,
        // depth i].
        for (std::size_t i = begin; i < end; ++i) {
          if (crossings[i].facing < 0) continue;
          const double from = i > begin ? crossings[i - 1].depth : -HUGE_VAL;
          const double to = crossings[i].depth;
          const std::uint32_t lo = partitionPoint(ascending, [from](double p) { return p <= from; });
          const std::uint32_t hi = partitionPoint(ascending, [to](double p) { return p <= to; });
          for (std::uint32_t s = lo; s < hi; ++s) grid[base + s * stride[f.a]] |= ascendFlag;
        }
        begin = end;
      }
    }
  }
}

}  // namespace

void castAxisVotes(IProgress& progress, const MeshData& mesh, AxisVoteGrid& votes, int threads) {
  if (mesh.vertices.empty() || mesh.triangles.empty()) return;
  const CentredMesh centred = centre(mesh);
  const int workers = threads > 0 ? threads : processorThreads();
  for (const AxisFrame& frame : kFrames) sweepAxis(progress, mesh, centred, frame, votes, workers);
}

void voxelizeInterior(IProgress& progress,
                      const MeshData& mesh,
                      VoxelBitGrid& grid,
                      bool refineInterior,
                      float windingThreshold) {
  if (mesh.vertices.empty() || mesh.triangles.empty()) return;
  AxisVoteGrid votes{grid.dims, std::vector<std::uint8_t>(static_cast<std::size_t>(grid.cellCount()), 0)};
  castAxisVotes(progress, mesh, votes);
  settleVotes(progress, mesh, votes, grid, refineInterior, windingThreshold);
}

}  // namespace TessikSDK::GeomBind::Cpu

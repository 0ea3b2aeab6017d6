#include "pipeline/weld.h"

#include <algorithm>
#include <climits>
#include <cmath>
#include <cstdint>
#include <cstring>
#include <numeric>
#include <unordered_map>

namespace TessikSDK::Pipeline {
namespace {

struct CellKey {
  std::int64_t x, y, z;
  bool operator==(const CellKey& o) const { return x == o.x && y == o.y && z == o.z; }
};

struct CellHash {
  std::size_t operator()(const CellKey& k) const {
    return static_cast<std::size_t>(k.x * 73856093LL) ^ static_cast<std::size_t>(k.y * 19349663LL) ^
           static_cast<std::size_t>(k.z * 83492791LL);
  }
};

}  // namespace

float defaultWeldTolerance(const Mesh& mesh) {
  if (mesh.positions.empty()) return 0.0f;
  std::array<float, 3> lo = mesh.positions[0], hi = lo;
  for (const std::array<float, 3>& p : mesh.positions)
    for (int c = 0; c < 3; ++c) {
      lo[c] = std::min(lo[c], p[c]);
      hi[c] = std::max(hi[c], p[c]);
    }
  // In double: the squares of a box wider than 1e19 overflow single precision, and an infinite
  // tolerance would weld every vertex into one.
  const double dx = double(hi[0]) - lo[0], dy = double(hi[1]) - lo[1], dz = double(hi[2]) - lo[2];
  return static_cast<float>(1e-6 * std::sqrt(dx * dx + dy * dy + dz * dz));
}

WeldedMesh weldByPosition(const Mesh& mesh, float tolerance) {
  WeldedMesh out;
  out.weldOf.resize(mesh.positions.size());
  // Cells as wide as the tolerance: a partner can only be in the vertex's own cell or a neighbouring one.
  // Counted from the mesh's lower corner, so that a small mesh far from the origin cannot push a cell
  // number past 64 bits.
  const double cell = tolerance > 0.0f && std::isfinite(tolerance) ? static_cast<double>(tolerance) : 0.0;
  std::array<double, 3> lower{0.0, 0.0, 0.0};
  if (!mesh.positions.empty()) {
    for (int c = 0; c < 3; ++c) lower[c] = mesh.positions[0][c];
    for (const std::array<float, 3>& p : mesh.positions)
      for (int c = 0; c < 3; ++c) lower[c] = std::min(lower[c], double(p[c]));
  }
  auto keyOf = [&](const std::array<float, 3>& p) {
    if (cell == 0.0) {
      // Exact matching: the bit patterns are the key (with -0 folded onto +0).
      auto bits = [](float f) {
        f = f == 0.0f ? 0.0f : f;
        std::int32_t b;
        std::memcpy(&b, &f, sizeof b);
        return static_cast<std::int64_t>(b);
      };
      return CellKey{bits(p[0]), bits(p[1]), bits(p[2])};
    }
    auto index = [&](int c) {
      // At most the box's extent over the tolerance, about a million for the default; clamped all the
      // same, since a caller may pass any tolerance.
      const double steps = std::floor((double(p[c]) - lower[c]) / cell);
      return static_cast<std::int64_t>(std::min(steps, 1e15));
    };
    return CellKey{index(0), index(1), index(2)};
  };
  std::unordered_map<CellKey, std::vector<std::uint32_t>, CellHash> cells;
  cells.reserve(mesh.positions.size());
  const int reach = cell == 0.0 ? 0 : 1;
  for (std::size_t v = 0; v < mesh.positions.size(); ++v) {
    const std::array<float, 3>& p = mesh.positions[v];
    const CellKey key = keyOf(p);
    std::int64_t found = -1;
    for (int dx = -reach; dx <= reach && found < 0; ++dx)
      for (int dy = -reach; dy <= reach && found < 0; ++dy)
        for (int dz = -reach; dz <= reach && found < 0; ++dz) {
          const auto it = cells.find({key.x + dx, key.y + dy, key.z + dz});
          if (it == cells.end()) continue;
          for (std::uint32_t w : it->second) {
            const std::array<float, 3>& q = out.mesh.positions[w];
            if (std::fabs(q[0] - p[0]) <= tolerance && std::fabs(q[1] - p[1]) <= tolerance &&
                std::fabs(q[2] - p[2]) <= tolerance) {
              found = w;
              break;
            }
          }
        }
    if (found < 0) {
      found = static_cast<std::int64_t>(out.mesh.positions.size());
      out.mesh.positions.push_back(p);
      cells[key].push_back(static_cast<std::uint32_t>(found));
    }
    out.weldOf[v] = static_cast<std::uint32_t>(found);
  }
  for (const auto& t : mesh.triangles) {
    const std::array<std::uint32_t, 3> w = {out.weldOf.at(t[0]), out.weldOf.at(t[1]), out.weldOf.at(t[2])};
    if (w[0] == w[1] || w[1] == w[2] || w[0] == w[2]) continue;
    out.mesh.triangles.push_back(w);
  }
  return out;
}

std::size_t dropFlatTriangles(Mesh& mesh) {
  if (mesh.positions.empty()) return 0;
  std::array<double, 3> lo, hi;
  for (int c = 0; c < 3; ++c) lo[c] = hi[c] = mesh.positions[0][c];
  for (const auto& p : mesh.positions)
    for (int c = 0; c < 3; ++c) {
      lo[c] = std::min(lo[c], double(p[c]));
      hi[c] = std::max(hi[c], double(p[c]));
    }
  const double extent = std::max({hi[0] - lo[0], hi[1] - lo[1], hi[2] - lo[2]});
  // Twice the heat method's own limit, so that rounding on its side of the unit frame cannot let one through.
  const double limit = 2e-10 * extent * extent;
  const std::size_t before = mesh.triangles.size();
  auto flat = [&](const std::array<std::uint32_t, 3>& t) {
    std::array<double, 3> u, w;
    for (int c = 0; c < 3; ++c) {
      u[c] = double(mesh.positions[t[1]][c]) - mesh.positions[t[0]][c];
      w[c] = double(mesh.positions[t[2]][c]) - mesh.positions[t[0]][c];
    }
    const double x = u[1] * w[2] - u[2] * w[1], y = u[2] * w[0] - u[0] * w[2], z = u[0] * w[1] - u[1] * w[0];
    return 0.5 * std::sqrt(x * x + y * y + z * z) < limit;
  };
  mesh.triangles.erase(std::remove_if(mesh.triangles.begin(), mesh.triangles.end(), flat),
                       mesh.triangles.end());
  return before - mesh.triangles.size();
}

std::size_t labelPieces(const Mesh& mesh, std::vector<std::uint32_t>& pieceOf) {
  std::vector<std::uint32_t> root(mesh.positions.size());
  std::iota(root.begin(), root.end(), 0u);
  auto find = [&](std::uint32_t v) {
    while (root[v] != v) v = root[v] = root[root[v]];
    return v;
  };
  for (const auto& t : mesh.triangles) {
    // The smaller root wins, so labels do not depend on the order of the triangles' corners.
    const std::uint32_t a = find(t[0]), b = find(t[1]), c = find(t[2]);
    const std::uint32_t r = std::min({a, b, c});
    root[a] = root[b] = root[c] = r;
  }
  pieceOf.assign(mesh.positions.size(), 0);
  std::vector<std::uint32_t> label(mesh.positions.size(), UINT32_MAX);
  std::size_t pieces = 0;
  for (std::uint32_t v = 0; v < mesh.positions.size(); ++v) {
    const std::uint32_t r = find(v);
    if (label[r] == UINT32_MAX) label[r] = static_cast<std::uint32_t>(pieces++);
    pieceOf[v] = label[r];
  }
  return pieces;
}

std::size_t orientPiecesOutward(Mesh& mesh) {
  std::vector<std::uint32_t> pieceOf;
  const std::size_t pieces = labelPieces(mesh, pieceOf);
  std::vector<std::array<double, 3>> centre(pieces, {0.0, 0.0, 0.0});
  std::vector<double> count(pieces, 0.0);
  for (std::size_t v = 0; v < mesh.positions.size(); ++v) {
    for (int c = 0; c < 3; ++c) centre[pieceOf[v]][c] += mesh.positions[v][c];
    count[pieceOf[v]] += 1.0;
  }
  for (std::size_t p = 0; p < pieces; ++p)
    for (int c = 0; c < 3; ++c) centre[p][c] /= count[p];
  std::vector<double> volume(pieces, 0.0);
  for (const auto& t : mesh.triangles) {
    const std::size_t p = pieceOf[t[0]];
    std::array<std::array<double, 3>, 3> q;
    for (int k = 0; k < 3; ++k)
      for (int c = 0; c < 3; ++c) q[k][c] = mesh.positions[t[k]][c] - centre[p][c];
    volume[p] += q[0][0] * (q[1][1] * q[2][2] - q[1][2] * q[2][1]) -
                 q[0][1] * (q[1][0] * q[2][2] - q[1][2] * q[2][0]) +
                 q[0][2] * (q[1][0] * q[2][1] - q[1][1] * q[2][0]);
  }
  std::size_t flipped = 0;
  for (double v : volume) flipped += v < 0.0 ? 1 : 0;
  if (flipped == 0) return 0;
  for (auto& t : mesh.triangles)
    if (volume[pieceOf[t[0]]] < 0.0) std::swap(t[1], t[2]);
  return flipped;
}

Weights unweldWeights(const Weights& welded, const std::vector<std::uint32_t>& weldOf) {
  Weights out;
  out.offsets.reserve(weldOf.size() + 1);
  for (std::uint32_t w : weldOf) {
    if (w < welded.numVertices())
      out.influences.insert(out.influences.end(), welded.influences.begin() + welded.begin(w),
                            welded.influences.begin() + welded.end(w));
    out.offsets.push_back(static_cast<std::uint32_t>(out.influences.size()));
  }
  return out;
}

}  // namespace TessikSDK::Pipeline

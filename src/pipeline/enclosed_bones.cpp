#include "pipeline/enclosed_bones.h"

#include <algorithm>
#include <array>
#include <limits>
#include <utility>

#include "pipeline/influences.h"

namespace TessikSDK::Pipeline {
namespace {

using Vec3 = std::array<double, 3>;

struct Segment {
  std::uint32_t bone;
  Vec3 a, b;
};

Vec3 jointOf(const Bone& bone) { return {bone.bindPose[3], bone.bindPose[7], bone.bindPose[11]}; }

double squaredDistance(const Vec3& p, const Segment& s) {
  Vec3 ab, ap;
  for (int k = 0; k < 3; ++k) {
    ab[k] = s.b[k] - s.a[k];
    ap[k] = p[k] - s.a[k];
  }
  const double length = ab[0] * ab[0] + ab[1] * ab[1] + ab[2] * ab[2];
  const double t =
      length > 0.0 ? std::clamp((ap[0] * ab[0] + ap[1] * ab[1] + ap[2] * ab[2]) / length, 0.0, 1.0) : 0.0;
  double d = 0.0;
  for (int k = 0; k < 3; ++k) d += (ap[k] - t * ab[k]) * (ap[k] - t * ab[k]);
  return d;
}

}  // namespace

std::size_t giveEnclosedBones(const Mesh& mesh,
                              const std::vector<std::uint32_t>& pieceOf,
                              const std::vector<bool>& unbound,
                              const std::vector<Bone>& bones,
                              const std::vector<LeafTip>& tips,
                              Weights& weights) {
  std::vector<Segment> segments;
  std::vector<bool> hasEnd(bones.size(), false);
  for (std::uint32_t b = 0; b < bones.size(); ++b) {
    if (bones[b].parent < 0) continue;
    const auto parent = static_cast<std::uint32_t>(bones[b].parent);
    segments.push_back({parent, jointOf(bones[parent]), jointOf(bones[b])});
    hasEnd[parent] = true;
  }
  for (const LeafTip& tip : tips) {
    segments.push_back({tip.leaf, jointOf(bones[tip.leaf]), tip.position});
    hasEnd[tip.leaf] = true;
  }
  for (std::uint32_t b = 0; b < bones.size(); ++b)
    if (!hasEnd[b]) segments.push_back({b, jointOf(bones[b]), jointOf(bones[b])});

  std::vector<std::int64_t> owner(mesh.positions.size(), -1);
  std::size_t given = 0;
  for (std::uint32_t piece = 0; piece < unbound.size(); ++piece) {
    if (!unbound[piece]) continue;
    std::vector<std::array<std::uint32_t, 3>> shell;
    for (const auto& t : mesh.triangles)
      if (pieceOf[t[0]] == piece) shell.push_back(t);
    if (shell.empty()) continue;
    std::vector<bool> inside(bones.size(), false);
    for (const Segment& s : segments) {
      if (inside[s.bone]) continue;
      const Vec3 middle = {(s.a[0] + s.b[0]) / 2, (s.a[1] + s.b[1]) / 2, (s.a[2] + s.b[2]) / 2};
      inside[s.bone] = windingNumber(mesh.positions, shell, s.a) >= 0.5 ||
                       windingNumber(mesh.positions, shell, middle) >= 0.5;
    }
    if (std::none_of(inside.begin(), inside.end(), [](bool b) { return b; })) continue;
    ++given;
    for (std::size_t v = 0; v < mesh.positions.size(); ++v) {
      if (pieceOf[v] != piece) continue;
      const Vec3 p = {mesh.positions[v][0], mesh.positions[v][1], mesh.positions[v][2]};
      double bestDistance = std::numeric_limits<double>::infinity();
      for (const Segment& s : segments) {
        if (!inside[s.bone]) continue;
        const double d = squaredDistance(p, s);
        if (d < bestDistance || (d == bestDistance && s.bone < owner[v])) {
          bestDistance = d;
          owner[v] = s.bone;
        }
      }
    }
  }
  if (given > 0) giveWholly(owner, weights);
  return given;
}

}  // namespace TessikSDK::Pipeline

#include "pipeline/leaf_tips.h"

#include <algorithm>
#include <cmath>
#include <limits>
#include <utility>

namespace TessikSDK::Pipeline {
namespace {

using Vec3 = std::array<double, 3>;

Vec3 sub(const Vec3& a, const Vec3& b) { return {a[0] - b[0], a[1] - b[1], a[2] - b[2]}; }
double dot(const Vec3& a, const Vec3& b) { return a[0] * b[0] + a[1] * b[1] + a[2] * b[2]; }
Vec3 cross(const Vec3& a, const Vec3& b) {
  return {a[1] * b[2] - a[2] * b[1], a[2] * b[0] - a[0] * b[2], a[0] * b[1] - a[1] * b[0]};
}
double norm(const Vec3& a) { return std::sqrt(dot(a, a)); }
Vec3 corner(const Mesh& mesh, std::uint32_t v) {
  const auto& p = mesh.positions[v];
  return {p[0], p[1], p[2]};
}
Vec3 jointOf(const Bone& bone) { return {bone.bindPose[3], bone.bindPose[7], bone.bindPose[11]}; }

// Where the ray crosses a triangle, and whether it goes out through it (along the outward normal).
struct Crossing {
  double t;
  bool leaving;
};

std::vector<Crossing> crossings(const Mesh& mesh, const Vec3& origin, const Vec3& direction) {
  std::vector<Crossing> out;
  for (const auto& tri : mesh.triangles) {
    const Vec3 a = corner(mesh, tri[0]);
    const Vec3 e1 = sub(corner(mesh, tri[1]), a), e2 = sub(corner(mesh, tri[2]), a);
    const Vec3 p = cross(direction, e2);
    const double det = dot(e1, p);
    if (det == 0.0) continue;  // the ray runs in the triangle's plane
    const Vec3 s = sub(origin, a);
    const double u = dot(s, p) / det;
    if (u < 0.0 || u > 1.0) continue;
    const Vec3 q = cross(s, e1);
    const double v = dot(direction, q) / det;
    if (v < 0.0 || u + v > 1.0) continue;
    const double t = dot(e2, q) / det;
    // det = -direction . (e1 x e2): negative when the ray goes out through the triangle's front.
    if (t > 0.0) out.push_back({t, det < 0.0});
  }
  std::sort(out.begin(), out.end(), [](const Crossing& x, const Crossing& y) { return x.t < y.t; });
  // A ray through an edge or a corner hits every triangle that shares it, but crosses the surface once.
  std::vector<Crossing> distinct;
  for (const Crossing& c : out)
    if (distinct.empty() || distinct.back().leaving != c.leaving ||
        c.t - distinct.back().t > 1e-9 * (1.0 + c.t))
      distinct.push_back(c);
  return distinct;
}

// How far along `direction` (unit) the ray from `origin`, which starts `depth` surfaces deep, first
// comes out of all of them; 0 when it never does.
double exitDistance(const Mesh& mesh, const Vec3& origin, const Vec3& direction, int depth) {
  for (const Crossing& c : crossings(mesh, origin, direction)) {
    depth += c.leaving ? -1 : 1;
    if (depth <= 0) return c.t;
  }
  return 0.0;
}

// How far the tip may run from its leaf's joint before it is nearer another joint than its own: past
// the plane halfway to that joint it would take the part that joint's bone carries (a second chain's
// root, a bone the file forgot to parent).
double reachBeforeOtherJoints(const std::vector<Bone>& bones,
                              std::uint32_t leaf,
                              const Vec3& joint,
                              const Vec3& direction) {
  double reach = std::numeric_limits<double>::infinity();
  for (std::uint32_t other = 0; other < bones.size(); ++other) {
    if (other == leaf) continue;
    const Vec3 toOther = sub(jointOf(bones[other]), joint);
    const double ahead = dot(direction, toOther);
    if (ahead > 0.0) reach = std::min(reach, dot(toOther, toOther) / (2.0 * ahead));
  }
  return reach;
}

}  // namespace

double windingNumber(const std::vector<std::array<float, 3>>& positions,
                     const std::vector<std::array<std::uint32_t, 3>>& triangles,
                     const Vec3& point) {
  auto corner = [&](std::uint32_t v) {
    return Vec3{positions[v][0] - point[0], positions[v][1] - point[1], positions[v][2] - point[2]};
  };
  // Each triangle adds the solid angle it spans as seen from the point (van Oosterom and Strackee).
  double total = 0.0;
  for (const auto& tri : triangles) {
    const Vec3 a = corner(tri[0]), b = corner(tri[1]), c = corner(tri[2]);
    const double la = norm(a), lb = norm(b), lc = norm(c);
    const double numerator = dot(a, cross(b, c));
    const double denominator = la * lb * lc + dot(a, b) * lc + dot(b, c) * la + dot(c, a) * lb;
    total += 2.0 * std::atan2(numerator, denominator);
  }
  return total / (4.0 * M_PI);
}

double windingNumber(const Mesh& mesh, const Vec3& point) {
  return windingNumber(mesh.positions, mesh.triangles, point);
}

TipPlacement placeLeafTips(const Mesh& mesh, const std::vector<Bone>& bones) {
  TipPlacement placement;
  std::vector<bool> hasChild(bones.size(), false);
  for (const Bone& bone : bones)
    if (bone.parent >= 0) hasChild[static_cast<std::size_t>(bone.parent)] = true;
  for (std::uint32_t b = 0; b < bones.size(); ++b) {
    if (hasChild[b]) continue;
    const Bone& leaf = bones[b];
    const Vec3 joint = jointOf(leaf);
    Vec3 direction{};
    double length = 0.0;
    const bool fromSkeleton = leaf.hasTip && norm(sub(leaf.tip, joint)) > 0.0;
    if (fromSkeleton) {
      length = norm(sub(leaf.tip, joint));
      for (int k = 0; k < 3; ++k) direction[k] = (leaf.tip[k] - joint[k]) / length;
    } else if (leaf.parent >= 0) {
      const Vec3 along = sub(joint, jointOf(bones[static_cast<std::size_t>(leaf.parent)]));
      const double parentLength = norm(along);
      if (parentLength > 0.0) {
        for (int k = 0; k < 3; ++k) direction[k] = along[k] / parentLength;
        length = kTipLengthCap * parentLength;
      }
    }
    // A joint inside a body wrapped in clothing is inside both: the ray has to come out of each.
    const double winding = length > 0.0 ? windingNumber(mesh, joint) : 0.0;
    if (winding >= 0.5) {
      const double exit = exitDistance(mesh, joint, direction, static_cast<int>(std::lround(winding)));
      // The skeleton's own end is trusted while it stays inside; one past the surface would claim the air.
      if (!fromSkeleton || (exit > 0.0 && length > exit)) length = std::min(length, kTipReach * exit);
    } else if (!fromSkeleton) {
      length = 0.0;  // cast from a joint in the air, the ray would say nothing about the part
    }
    length = std::min(length, reachBeforeOtherJoints(bones, b, joint, direction));
    if (!(length > 0.0)) {
      ++placement.leavesWithoutTip;
      continue;
    }
    placement.tips.push_back({b,
                              {joint[0] + length * direction[0], joint[1] + length * direction[1],
                               joint[2] + length * direction[2]},
                              fromSkeleton});
  }
  return placement;
}

}  // namespace TessikSDK::Pipeline

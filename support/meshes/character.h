#pragma once

#include <algorithm>
#include <cmath>
#include <cstddef>
#include <string>
#include <vector>

#include "meshes/mesh_builders.h"

// A character-like figure for binding benchmarks: overlapping closed shells, one per body part, and a
// 30-bone skeleton whose joints sit inside them. Outward-wound like every builder here.
namespace tessik::meshes {

struct Bone {
  std::string name;
  std::string parent;  // empty for the root
  Vec3 position;       // joint position in metres

  // The form host interfaces take: null for the root.
  const char* parentName() const { return parent.empty() ? nullptr : parent.c_str(); }
};

struct Character {
  TriMesh mesh;
  std::vector<Bone> bones;  // every parent comes before its children
};

namespace character_parts {

inline Vec3 add(const Vec3& a, const Vec3& b) { return {a[0] + b[0], a[1] + b[1], a[2] + b[2]}; }
inline Vec3 sub(const Vec3& a, const Vec3& b) { return {a[0] - b[0], a[1] - b[1], a[2] - b[2]}; }
inline Vec3 scale(const Vec3& a, float s) { return {a[0] * s, a[1] * s, a[2] * s}; }
inline Vec3 cross(const Vec3& a, const Vec3& b) {
  return {a[1] * b[2] - a[2] * b[1], a[2] * b[0] - a[0] * b[2], a[0] * b[1] - a[1] * b[0]};
}
inline float length(const Vec3& a) { return std::sqrt(a[0] * a[0] + a[1] * a[1] + a[2] * a[2]); }
inline Vec3 normalized(const Vec3& a) { return scale(a, 1.0f / length(a)); }

// Maps the builders' x, y, z axes onto `xAxis`, `yAxis` (perpendicular to each other) and the direction
// of xAxis x yAxis scaled to `zLength`, then moves by `origin`. Such a frame is right-handed, so the
// winding stays outward; a mirror would flip it.
inline TriMesh placed(TriMesh m, const Vec3& origin, const Vec3& xAxis, const Vec3& yAxis, float zLength) {
  const Vec3 zAxis = scale(normalized(cross(xAxis, yAxis)), zLength);
  for (Vec3& p : m.positions)
    p = add(origin, add(scale(xAxis, p[0]), add(scale(yAxis, p[1]), scale(zAxis, p[2]))));
  return m;
}

// Any unit vector perpendicular to `d`, so that (d, it, d x it) is right-handed.
inline Vec3 perpendicular(const Vec3& d) {
  const Vec3 helper = std::fabs(d[1]) < 0.9f ? Vec3{0.0f, 1.0f, 0.0f} : Vec3{1.0f, 0.0f, 0.0f};
  return normalized(cross(helper, d));
}

// Both directions of a shell's grid grow by sqrt(detail), so its vertex count grows by about detail.
// detail 1 reproduces the counts as written exactly, keeping older figures comparable.
struct Tessellation {
  double factor;
  int operator()(int count, int minimum) const {
    return std::max(minimum, static_cast<int>(std::lround(count * factor)));
  }
};

// A capped cylinder from `a` to `b`.
inline TriMesh limb(const Vec3& a, const Vec3& b, float radius, int rings, int segments) {
  const Vec3 axis = sub(b, a);
  const float len = length(axis);
  const Vec3 d = scale(axis, 1.0f / len);
  return placed(cylinderX(0.0f, len, 0.0f, 0.0f, radius, rings, segments), a, d, perpendicular(d), 1.0f);
}

// An ellipsoid with semi-axes `radii` along x, y, z, centred at `c`.
inline TriMesh ellipsoid(const Vec3& c, const Vec3& radii, int rings, int segments) {
  return placed(sphere({0.0f, 0.0f, 0.0f}, 1.0f, rings, segments), c, {radii[0], 0.0f, 0.0f},
                {0.0f, radii[1], 0.0f}, radii[2]);
}

inline const Vec3& joint(const std::vector<Bone>& bones, const std::string& name) {
  return std::find_if(bones.begin(), bones.end(), [&](const Bone& b) { return b.name == name; })->position;
}

// Joints in metres: y up, the character faces +z, its left side at +x. Arms hang 20 degrees below
// horizontal and legs spread slightly, so no limb lies along a grid axis.
inline std::vector<Bone> skeleton() {
  std::vector<Bone> s;
  s.push_back({"pelvis", "", {0.0f, 0.92f, 0.0f}});
  s.push_back({"spine1", "pelvis", {0.0f, 1.05f, 0.0f}});
  s.push_back({"spine2", "spine1", {0.0f, 1.18f, 0.0f}});
  s.push_back({"chest", "spine2", {0.0f, 1.32f, 0.0f}});
  s.push_back({"neck", "chest", {0.0f, 1.47f, 0.0f}});
  s.push_back({"head", "neck", {0.0f, 1.62f, 0.0f}});
  const float down = 0.34906585f;  // 20 degrees
  for (const float side : {1.0f, -1.0f}) {
    const std::string p = side > 0 ? "l_" : "r_";
    const Vec3 arm = {side * std::cos(down), -std::sin(down), 0.0f};
    const Vec3 shoulder = {side * 0.2f, 1.40f, 0.0f};
    s.push_back({p + "clavicle", "chest", {side * 0.07f, 1.40f, 0.0f}});
    s.push_back({p + "shoulder", p + "clavicle", shoulder});
    s.push_back({p + "elbow", p + "shoulder", add(shoulder, scale(arm, 0.28f))});
    s.push_back({p + "wrist", p + "elbow", add(shoulder, scale(arm, 0.53f))});
    for (const float offset : {0.02f, -0.02f}) {
      const std::string finger = p + (offset > 0 ? "index" : "middle");
      const Vec3 base = add(add(shoulder, scale(arm, 0.64f)), {0.0f, 0.0f, offset});
      s.push_back({finger + "1", p + "wrist", base});
      s.push_back({finger + "2", finger + "1", add(base, scale(arm, 0.045f))});
    }
    s.push_back({p + "hip", "pelvis", {side * 0.1f, 0.88f, 0.0f}});
    s.push_back({p + "knee", p + "hip", {side * 0.12f, 0.49f, 0.0f}});
    s.push_back({p + "ankle", p + "knee", {side * 0.13f, 0.09f, 0.0f}});
    s.push_back({p + "toe", p + "ankle", {side * 0.13f, 0.035f, 0.15f}});
  }
  return s;
}

inline TriMesh body(const std::vector<Bone>& s, const Tessellation& n) {
  TriMesh m;
  m.append(limb({0.0f, 0.82f, 0.0f}, {0.0f, 1.46f, 0.0f}, 0.16f, n(48, 1), n(80, 3)));  // torso
  m.append(limb({0.0f, 1.42f, 0.0f}, {0.0f, 1.58f, 0.0f}, 0.055f, n(8, 1), n(48, 3)));  // neck
  m.append(ellipsoid({0.0f, 1.68f, 0.01f}, {0.1f, 0.12f, 0.11f}, n(40, 2), n(80, 3)));  // head
  for (const std::string p : {"l_", "r_"}) {
    const Vec3 arm = normalized(sub(joint(s, p + "wrist"), joint(s, p + "shoulder")));
    m.append(limb(sub(joint(s, p + "shoulder"), scale(arm, 0.05f)), joint(s, p + "elbow"), 0.055f, n(40, 1),
                  n(48, 3)));
    m.append(limb(sub(joint(s, p + "elbow"), scale(arm, 0.03f)), joint(s, p + "wrist"), 0.042f, n(40, 1),
                  n(48, 3)));
    // A flattened hand, then two fingers out of its far end.
    const Vec3 palm = add(joint(s, p + "wrist"), scale(arm, 0.06f));
    m.append(placed(sphere({0.0f, 0.0f, 0.0f}, 1.0f, n(16, 2), n(32, 3)), palm, scale(arm, 0.07f),
                    scale(cross({0.0f, 0.0f, 1.0f}, arm), 0.022f), 0.045f));
    for (const std::string finger : {"index", "middle"}) {
      const Vec3& base = joint(s, p + finger + "1");
      m.append(limb(sub(base, scale(arm, 0.02f)), add(base, scale(arm, 0.09f)), 0.012f, n(6, 1), n(16, 3)));
    }
    m.append(limb(add(joint(s, p + "hip"), {0.0f, 0.06f, 0.0f}), joint(s, p + "knee"), 0.075f, n(40, 1),
                  n(48, 3)));
    // The shin runs on below the ankle so that the joint sits inside it, not on its cap.
    const Vec3& ankle = joint(s, p + "ankle");
    m.append(limb(add(joint(s, p + "knee"), {0.0f, 0.03f, 0.0f}), add(ankle, {0.0f, -0.04f, 0.0f}), 0.052f,
                  n(40, 1), n(48, 3)));
    m.append(ellipsoid({ankle[0], 0.045f, 0.06f}, {0.05f, 0.045f, 0.14f}, n(16, 2), n(32, 3)));  // foot
  }
  return m;
}

}  // namespace character_parts

// The vertex count grows about in proportion to `detail`: 1 gives 25,622 vertices and 51,168 triangles,
// 2 gives 51,319 and 102,562, 0.4 gives 10,183 and 20,290.
inline Character character(double detail = 1.0) {
  Character c;
  c.bones = character_parts::skeleton();
  c.mesh = character_parts::body(c.bones, character_parts::Tessellation{std::sqrt(std::max(detail, 0.0))});
  return c;
}

}  // namespace tessik::meshes

#pragma once

#include <algorithm>
#include <array>
#include <cmath>
#include <cstddef>
#include <cstdint>
#include <limits>
#include <random>
#include <vector>

#include "asset.h"

// Measuring weights by what they do rather than by their values: the same random poses skin the mesh
// with a file's painted weights and with the weights under test, and the distance between the two
// surfaces is the error. Two weightings that differ only where it does not show (a bone with no room to
// move, a joint that barely bends) score alike. These pieces need no binding, so they are tested alone.
namespace tessik::bench {

using Vec3d = std::array<double, 3>;

inline Vec3d movedBy(const bind::Mat4& m, const bind::Vec3f& p) {
  Vec3d out;
  for (int i = 0; i < 3; ++i)
    out[i] = m[4 * i] * p[0] + m[4 * i + 1] * p[1] + m[4 * i + 2] * p[2] + m[4 * i + 3];
  return out;
}

inline double distance(const Vec3d& a, const Vec3d& b) {
  return std::hypot(a[0] - b[0], a[1] - b[1], a[2] - b[2]);
}

inline Vec3d toDouble(const bind::Vec3f& p) { return {p[0], p[1], p[2]}; }

// Turning by `angle` radians about the unit `axis` through `centre`.
inline bind::Mat4 rotationAbout(const Vec3d& axis, double angle, const bind::Vec3f& centre) {
  const double c = std::cos(angle), s = std::sin(angle), t = 1.0 - c;
  const auto [x, y, z] = axis;
  bind::Mat4 m = {t * x * x + c,
                  t * x * y - s * z,
                  t * x * z + s * y,
                  0.0,
                  t * x * y + s * z,
                  t * y * y + c,
                  t * y * z - s * x,
                  0.0,
                  t * x * z - s * y,
                  t * y * z + s * x,
                  t * z * z + c,
                  0.0,
                  0.0,
                  0.0,
                  0.0,
                  1.0};
  const Vec3d turned = movedBy(m, centre);
  for (int i = 0; i < 3; ++i) m[4 * i + 3] = centre[i] - turned[i];
  return m;
}

// Per bone, the rigid motion of its bind-space points when each bone turns by `turns[j]` about its own
// joint and carries its children with it. For a pose made only of such turns this is the skinning
// matrix itself (posed frame times inverse bind), so no frame conventions of the file come into it.
inline std::vector<bind::Mat4> pose(const bind::Skeleton& skeleton, const std::vector<bind::Mat4>& turns) {
  std::vector<bind::Mat4> motion(skeleton.joints.size());
  for (std::size_t j = 0; j < motion.size(); ++j) {
    const int parent = skeleton.joints[j].parent;
    motion[j] = parent < 0 ? turns[j] : bind::multiply(motion[parent], turns[j]);
  }
  return motion;
}

// Every bone turned about a uniformly random axis by a normally distributed angle.
inline std::vector<bind::Mat4> randomPose(const bind::Skeleton& skeleton,
                                          std::mt19937& rng,
                                          double sigmaDegrees) {
  std::normal_distribution<double> normal;
  std::vector<bind::Mat4> turns;
  for (const bind::Joint& joint : skeleton.joints) {
    Vec3d axis{0.0, 0.0, 0.0};
    double length = 0.0;
    while (length < 1e-6) {
      axis = {normal(rng), normal(rng), normal(rng)};
      length = std::hypot(axis[0], axis[1], axis[2]);
    }
    for (double& a : axis) a /= length;
    const double angle = normal(rng) * sigmaDegrees * M_PI / 180.0;
    turns.push_back(rotationAbout(axis, angle, bind::translationOf(joint.bindPose)));
  }
  return pose(skeleton, turns);
}

// Linear blend skinning. A vertex without influences stays put.
inline std::vector<Vec3d> skin(const std::vector<bind::Vec3f>& positions,
                               const bind::VertexWeights& weights,
                               const std::vector<bind::Mat4>& motion) {
  std::vector<Vec3d> out(positions.size());
  for (std::size_t v = 0; v < positions.size(); ++v) {
    if (weights.begin(v) == weights.end(v)) {
      out[v] = toDouble(positions[v]);
      continue;
    }
    Vec3d sum{0.0, 0.0, 0.0};
    for (std::uint32_t i = weights.begin(v); i < weights.end(v); ++i) {
      const Vec3d p = movedBy(motion[weights.influences[i].bone], positions[v]);
      for (int k = 0; k < 3; ++k) sum[k] += weights.influences[i].weight * p[k];
    }
    out[v] = sum;
  }
  return out;
}

inline double segmentDistance(const Vec3d& p, const Vec3d& a, const Vec3d& b) {
  const Vec3d ab{b[0] - a[0], b[1] - a[1], b[2] - a[2]}, ap{p[0] - a[0], p[1] - a[1], p[2] - a[2]};
  const double length2 = ab[0] * ab[0] + ab[1] * ab[1] + ab[2] * ab[2];
  const double t =
      length2 > 0.0 ? std::clamp((ap[0] * ab[0] + ap[1] * ab[1] + ap[2] * ab[2]) / length2, 0.0, 1.0) : 0.0;
  return distance(p, {a[0] + t * ab[0], a[1] + t * ab[1], a[2] + t * ab[2]});
}

// The rigid-skinning baseline: each vertex wholly on the bone nearest to it. The segment from a joint to
// a child joint belongs to the joint's own bone, the one whose turning swings it; a leaf bone runs to its
// tip when it has one and is only its joint otherwise.
inline bind::VertexWeights nearestBoneWeights(const std::vector<bind::Vec3f>& positions,
                                              const bind::Skeleton& skeleton) {
  struct Segment {
    std::uint32_t bone;
    Vec3d from, to;
  };
  std::vector<Segment> segments;
  std::vector<bool> leaf(skeleton.joints.size(), true);
  for (const bind::Joint& joint : skeleton.joints) {
    if (joint.parent < 0) continue;
    leaf[joint.parent] = false;
    const auto& parent = skeleton.joints[joint.parent];
    segments.push_back({static_cast<std::uint32_t>(joint.parent),
                        toDouble(bind::translationOf(parent.bindPose)),
                        toDouble(bind::translationOf(joint.bindPose))});
  }
  for (std::size_t j = 0; j < skeleton.joints.size(); ++j) {
    if (!leaf[j]) continue;
    const bind::Joint& joint = skeleton.joints[j];
    const Vec3d at = toDouble(bind::translationOf(joint.bindPose));
    segments.push_back({static_cast<std::uint32_t>(j), at, joint.tip ? toDouble(*joint.tip) : at});
  }
  bind::VertexWeights weights;
  for (const bind::Vec3f& position : positions) {
    const Vec3d p = toDouble(position);
    const Segment* nearest = &segments.front();
    for (const Segment& s : segments)
      if (segmentDistance(p, s.from, s.to) < segmentDistance(p, nearest->from, nearest->to)) nearest = &s;
    weights.influences.push_back({nearest->bone, 1.0f});
    weights.offsets.push_back(static_cast<std::uint32_t>(weights.influences.size()));
  }
  return weights;
}

inline double boundingDiagonal(const std::vector<bind::Vec3f>& positions) {
  Vec3d lo = toDouble(positions.front()), hi = lo;
  for (const bind::Vec3f& p : positions)
    for (int k = 0; k < 3; ++k) lo[k] = std::min<double>(lo[k], p[k]), hi[k] = std::max<double>(hi[k], p[k]);
  return distance(lo, hi);
}

// How far `weights` skin each vertex from where `reference` does, in every pose, as a percentage of
// `scale`. Vertices the reference leaves unweighted are left out: it says nothing about where they go.
inline std::vector<double> poseErrors(const std::vector<bind::Vec3f>& positions,
                                      const bind::VertexWeights& reference,
                                      const bind::VertexWeights& weights,
                                      const std::vector<std::vector<bind::Mat4>>& poses,
                                      double scale) {
  std::vector<double> errors;
  for (const std::vector<bind::Mat4>& motion : poses) {
    const std::vector<Vec3d> want = skin(positions, reference, motion),
                             got = skin(positions, weights, motion);
    for (std::size_t v = 0; v < positions.size(); ++v)
      if (reference.begin(v) != reference.end(v)) errors.push_back(100.0 * distance(want[v], got[v]) / scale);
  }
  return errors;
}

// Linear between the two nearest ranks (numpy's default), so figures can be checked against a script.
inline double percentile(std::vector<double> values, double q) {
  if (values.empty()) return std::numeric_limits<double>::quiet_NaN();
  std::sort(values.begin(), values.end());
  const double at = q * static_cast<double>(values.size() - 1);
  const auto below = static_cast<std::size_t>(std::floor(at));
  const std::size_t above = std::min(below + 1, values.size() - 1);
  return values[below] + (at - static_cast<double>(below)) * (values[above] - values[below]);
}

inline double mean(const std::vector<double>& values) {
  double sum = 0.0;
  for (double v : values) sum += v;
  return values.empty() ? std::numeric_limits<double>::quiet_NaN() : sum / static_cast<double>(values.size());
}

}  // namespace tessik::bench

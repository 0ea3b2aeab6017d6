#pragma once

#include <algorithm>
#include <cmath>
#include <cstddef>
#include <cstdint>
#include <utility>
#include <vector>

#include "asset.h"
#include "default_character.h"

// Bound meshes for the preview tests, built without binding so that the weights are known exactly.
namespace tessik::test {

using bind::Mat4;

struct PreviewInput {
  bind::SurfaceMesh mesh;
  bind::Skeleton skeleton;
  bind::VertexWeights weights;
  std::vector<Mat4> jointWorld;  // the bind poses
};

inline Mat4 translate(double x, double y, double z) {
  return {1, 0, 0, x, 0, 1, 0, y, 0, 0, 1, z, 0, 0, 0, 1};
}

// An open tube of radius 0.3 along +Y from y = 0 to 2 with joints at y = 0, 1 and 2: rings below y = 1
// follow joint 0, rings above it joint 1, the middle ring both by half.
inline PreviewInput previewTube() {
  PreviewInput in;
  constexpr int kRings = 9, kSegments = 24;
  for (int r = 0; r < kRings; ++r) {
    const float y = 2.0f * r / (kRings - 1);
    for (int s = 0; s < kSegments; ++s) {
      const float a = 6.2831853f * s / kSegments;
      in.mesh.positions.push_back({0.3f * std::cos(a), y, 0.3f * std::sin(a)});
      if (y < 1.0f) in.weights.influences.push_back({0, 1.0f});
      if (y == 1.0f) in.weights.influences.insert(in.weights.influences.end(), {{0, 0.5f}, {1, 0.5f}});
      if (y > 1.0f) in.weights.influences.push_back({1, 1.0f});
      in.weights.offsets.push_back(static_cast<std::uint32_t>(in.weights.influences.size()));
      if (r + 1 == kRings) continue;
      const auto at = [&](int ring, int seg) {
        return static_cast<std::uint32_t>(ring * kSegments + seg % kSegments);
      };
      in.mesh.triangles.push_back({at(r, s), at(r + 1, s), at(r, s + 1)});
      in.mesh.triangles.push_back({at(r, s + 1), at(r + 1, s), at(r + 1, s + 1)});
    }
  }
  in.skeleton.joints = {
      {"hip", -1, translate(0, 0, 0)}, {"knee", 0, translate(0, 1, 0)}, {"toe", 1, translate(0, 2, 0)}};
  for (const auto& joint : in.skeleton.joints) in.jointWorld.push_back(joint.bindPose);
  return in;
}

// The tool's built-in character, each vertex shared by its two nearest joints in inverse proportion to
// their distances, so colours blend across every part as a binding's would.
inline PreviewInput previewCharacter() {
  const bind::ImportedAsset asset = bind::defaultCharacter();
  PreviewInput in{asset.mesh, asset.skeleton, {}, {}};
  for (const auto& joint : in.skeleton.joints) in.jointWorld.push_back(joint.bindPose);
  for (const bind::Vec3f& p : in.mesh.positions) {
    std::vector<std::pair<double, std::uint32_t>> near;
    for (std::size_t j = 0; j < in.jointWorld.size(); ++j) {
      const bind::Vec3f c = bind::translationOf(in.jointWorld[j]);
      near.emplace_back(std::hypot(p[0] - c[0], p[1] - c[1], p[2] - c[2]) + 1e-6,
                        static_cast<std::uint32_t>(j));
    }
    std::partial_sort(near.begin(), near.begin() + 2, near.end());
    const double w0 = near[1].first / (near[0].first + near[1].first);
    in.weights.influences.push_back({near[0].second, w0});
    in.weights.influences.push_back({near[1].second, 1.0 - w0});
    in.weights.offsets.push_back(static_cast<std::uint32_t>(in.weights.influences.size()));
  }
  return in;
}

}  // namespace tessik::test

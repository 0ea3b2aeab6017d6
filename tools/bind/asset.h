#pragma once

#include <array>
#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include <tessik/pipeline.h>

// What the binding tool carries between its stages: the surface as the file had it, the skeleton in the
// same space, and the weights the binding gave each vertex.
namespace tessik::bind {

using Vec3f = std::array<float, 3>;

// Sixteen doubles, row by row, applied to column vectors (p' = M p): translation in elements 3, 7 and 11.
// This is the layout ITransformHierarchy::addNode takes.
using Mat4 = std::array<double, 16>;

Mat4 identity();
Mat4 multiply(const Mat4& a, const Mat4& b);
// General inverse; throws std::runtime_error for a singular matrix.
Mat4 inverse(const Mat4& m);
Vec3f transformPoint(const Mat4& m, const Vec3f& p);
// Rotation and scale only, for normals of rigid or uniformly scaled transforms.
Vec3f transformVector(const Mat4& m, const Vec3f& v);
inline Vec3f translationOf(const Mat4& m) {
  return {static_cast<float>(m[3]), static_cast<float>(m[7]), static_cast<float>(m[11])};
}

struct Joint {
  std::string name;
  int parent = -1;  // index into Skeleton::joints, always smaller than this joint's own; -1 for a root
  Mat4 bindPose{};  // the joint's frame in mesh space at bind time
  // Where the bone ends, when the file says so (an end node under a leaf bone, a "tip" in the JSON).
  std::optional<Vec3f> tip{};
};

struct Skeleton {
  std::vector<Joint> joints;  // parents come before their children
};

struct SurfaceMesh {
  std::vector<Vec3f> positions;
  std::vector<Vec3f> normals;  // empty, or one per position
  std::vector<std::array<std::uint32_t, 3>> triangles;
};

// The library's own per-vertex influences: compressed rows, strongest first, `bone` indexing
// Skeleton::joints. A vertex may have none.
using Influence = TessikSDK::Pipeline::Influence;
using VertexWeights = TessikSDK::Pipeline::Weights;

}  // namespace tessik::bind

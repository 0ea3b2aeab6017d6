#include "pipeline/input_check.h"

#include <algorithm>
#include <array>
#include <cmath>
#include <cstdint>
#include <limits>
#include <map>
#include <sstream>

namespace TessikSDK::Pipeline {
namespace {

constexpr float kMaxCoordinate = 1e18f;

std::string boneLabel(const std::vector<Bone>& bones, std::size_t b) {
  return "bone " + std::to_string(b) + (bones[b].name.empty() ? "" : " ('" + bones[b].name + "')");
}

bool allFinite(const double* values, std::size_t count) {
  for (std::size_t i = 0; i < count; ++i)
    if (!std::isfinite(values[i])) return false;
  return true;
}

}  // namespace

std::string checkMesh(const Mesh& mesh) {
  if (mesh.positions.empty()) return "the mesh has no vertices";
  if (mesh.triangles.empty()) return "the mesh has no triangles";
  if (mesh.positions.size() > std::numeric_limits<std::uint32_t>::max())
    return "the mesh has more vertices than 32-bit indices can address";
  for (std::size_t v = 0; v < mesh.positions.size(); ++v)
    for (float c : mesh.positions[v]) {
      if (!std::isfinite(c)) return "vertex " + std::to_string(v) + " has a coordinate that is not finite";
      // The methods square lengths in single precision on the way to their unit frame.
      if (std::fabs(c) > kMaxCoordinate)
        return "vertex " + std::to_string(v) + " has a coordinate of " + std::to_string(c) +
               ", beyond the 1e18 the binding can scale: scale the mesh and skeleton down first";
    }
  for (std::size_t t = 0; t < mesh.triangles.size(); ++t)
    for (std::uint32_t corner : mesh.triangles[t])
      if (corner >= mesh.positions.size())
        return "triangle " + std::to_string(t) + " names vertex " + std::to_string(corner) +
               ", but the mesh has " + std::to_string(mesh.positions.size()) + " vertices";
  // The methods scale the mesh into a unit box; a box of size zero has no scale.
  for (const auto& p : mesh.positions)
    if (p != mesh.positions.front()) return {};
  return "all vertices lie at one point: the mesh has no extent to bind";
}

std::string checkSkeletonMeetsMesh(const Mesh& mesh, const std::vector<Bone>& bones) {
  std::array<double, 3> lo{}, hi{}, jointLo{}, jointHi{};
  for (int c = 0; c < 3; ++c) lo[c] = hi[c] = mesh.positions[0][c];
  for (const auto& p : mesh.positions)
    for (int c = 0; c < 3; ++c) {
      lo[c] = std::min(lo[c], double(p[c]));
      hi[c] = std::max(hi[c], double(p[c]));
    }
  const double margin =
      0.1 * std::sqrt((hi[0] - lo[0]) * (hi[0] - lo[0]) + (hi[1] - lo[1]) * (hi[1] - lo[1]) +
                      (hi[2] - lo[2]) * (hi[2] - lo[2]));
  for (std::size_t b = 0; b < bones.size(); ++b) {
    const std::array<double, 3> joint = {bones[b].bindPose[3], bones[b].bindPose[7], bones[b].bindPose[11]};
    bool inside = true;
    for (int c = 0; c < 3; ++c) {
      inside = inside && joint[c] >= lo[c] - margin && joint[c] <= hi[c] + margin;
      jointLo[c] = b == 0 ? joint[c] : std::min(jointLo[c], joint[c]);
      jointHi[c] = b == 0 ? joint[c] : std::max(jointHi[c], joint[c]);
    }
    if (inside) return {};
  }
  auto box = [](const std::array<double, 3>& a, const std::array<double, 3>& z) {
    std::ostringstream text;
    text.precision(4);
    text << "(" << a[0] << ", " << a[1] << ", " << a[2] << ") to (" << z[0] << ", " << z[1] << ", " << z[2]
         << ")";
    return text.str();
  };
  return "no joint lies within the mesh: its vertices span " + box(lo, hi) + ", the joints " +
         box(jointLo, jointHi) + "; are the skeleton and the mesh in the same space and units?";
}

std::string checkBones(const std::vector<Bone>& bones) {
  if (bones.empty()) return "there are no bones: binding needs at least one";
  std::map<std::string, std::size_t> seen;
  for (std::size_t b = 0; b < bones.size(); ++b) {
    const Bone& bone = bones[b];
    if (bone.name.empty()) return boneLabel(bones, b) + " has no name";
    if (bone.name.find('\0') != std::string::npos) return boneLabel(bones, b) + " has a NUL in its name";
    const auto [it, fresh] = seen.emplace(bone.name, b);
    if (!fresh) return boneLabel(bones, b) + " repeats the name of bone " + std::to_string(it->second);
    if (bone.parent < -1 || bone.parent >= static_cast<int>(bones.size()))
      return boneLabel(bones, b) + " names parent " + std::to_string(bone.parent) +
             ", which is not -1 (a root) or a bone index below " + std::to_string(bones.size());
    if (!allFinite(bone.bindPose.data(), bone.bindPose.size()))
      return boneLabel(bones, b) + " has a bind pose that is not finite";
    if (bone.hasTip && !allFinite(bone.tip.data(), bone.tip.size()))
      return boneLabel(bones, b) + " has a tip that is not finite";
  }
  // Walk up from every bone; meeting a bone still on the current walk means a cycle.
  enum : char { kUnseen, kOnWalk, kDone };
  std::vector<char> state(bones.size(), kUnseen);
  for (std::size_t b = 0; b < bones.size(); ++b) {
    std::vector<int> walk;
    int j = static_cast<int>(b);
    while (j != -1 && state[static_cast<std::size_t>(j)] == kUnseen) {
      state[static_cast<std::size_t>(j)] = kOnWalk;
      walk.push_back(j);
      j = bones[static_cast<std::size_t>(j)].parent;
    }
    if (j != -1 && state[static_cast<std::size_t>(j)] == kOnWalk) {
      std::string cycle = std::to_string(j);
      for (int k = bones[static_cast<std::size_t>(j)].parent; k != j;
           k = bones[static_cast<std::size_t>(k)].parent)
        cycle += " -> " + std::to_string(k);
      return "the parents do not form a forest: bones " + cycle + " -> " + std::to_string(j) +
             " form a cycle";
    }
    for (int k : walk) state[static_cast<std::size_t>(k)] = kDone;
  }
  return {};
}

}  // namespace TessikSDK::Pipeline

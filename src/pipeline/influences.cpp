#include "pipeline/influences.h"

#include <algorithm>
#include <cmath>
#include <limits>
#include <string>

namespace TessikSDK::Pipeline {

std::string checkWeights(const Weights& weights,
                         std::size_t vertexCount,
                         std::size_t boneCount,
                         bool everyVertexWeighted) {
  const auto& offsets = weights.offsets;
  if (offsets.empty() || offsets.front() != 0 || offsets.back() != weights.influences.size())
    return "the weight offsets do not cover the influences";
  if (offsets.size() != vertexCount + 1)
    return "there are weights for " + std::to_string(offsets.size() - 1) + " vertices, but the mesh has " +
           std::to_string(vertexCount);
  for (std::size_t v = 0; v < vertexCount; ++v) {
    if (offsets[v] > offsets[v + 1]) return "the weight offsets decrease at vertex " + std::to_string(v);
    bool weighted = false;
    for (std::uint32_t i = offsets[v]; i < offsets[v + 1]; ++i) {
      const Influence& in = weights.influences[i];
      if (in.bone >= boneCount)
        return "vertex " + std::to_string(v) + " names bone " + std::to_string(in.bone) + " of " +
               std::to_string(boneCount);
      if (!std::isfinite(in.weight) || in.weight < 0.0)
        return "vertex " + std::to_string(v) + " has weight " + std::to_string(in.weight);
      weighted = weighted || in.weight > 0.0;
    }
    if (everyVertexWeighted && !weighted)
      return "vertex " + std::to_string(v) + " has no influence with a positive weight";
  }
  return {};
}

Weights foldAndLimit(const Weights& nodeWeights,
                     const std::vector<std::uint32_t>& boneOfNode,
                     unsigned maxInfluences) {
  Weights out;
  out.offsets.reserve(nodeWeights.offsets.size());
  std::vector<Influence> row;
  for (std::size_t v = 0; v < nodeWeights.numVertices(); ++v) {
    row.clear();
    for (std::uint32_t i = nodeWeights.begin(v); i < nodeWeights.end(v); ++i) {
      const Influence& in = nodeWeights.influences[i];
      if (!(in.weight > 0.0) || in.bone >= boneOfNode.size()) continue;
      const std::uint32_t bone = boneOfNode[in.bone];
      const auto same =
          std::find_if(row.begin(), row.end(), [&](const Influence& x) { return x.bone == bone; });
      if (same != row.end()) {
        same->weight += in.weight;
      } else {
        row.push_back({bone, in.weight});
      }
    }
    std::sort(row.begin(), row.end(), [](const Influence& a, const Influence& b) {
      return a.weight != b.weight ? a.weight > b.weight : a.bone < b.bone;
    });
    if (maxInfluences > 0 && row.size() > maxInfluences) row.resize(maxInfluences);
    double total = 0.0;
    for (const Influence& in : row) total += in.weight;
    for (Influence& in : row) in.weight /= total;
    out.influences.insert(out.influences.end(), row.begin(), row.end());
    out.offsets.push_back(static_cast<std::uint32_t>(out.influences.size()));
  }
  return out;
}

void giveWholly(const std::vector<std::int64_t>& owner, Weights& weights) {
  Weights out;
  out.offsets.reserve(weights.offsets.size());
  for (std::size_t v = 0; v < weights.numVertices(); ++v) {
    if (owner[v] >= 0) {
      out.influences.push_back({static_cast<std::uint32_t>(owner[v]), 1.0});
    } else {
      out.influences.insert(out.influences.end(), weights.influences.begin() + weights.begin(v),
                            weights.influences.begin() + weights.end(v));
    }
    out.offsets.push_back(static_cast<std::uint32_t>(out.influences.size()));
  }
  weights = std::move(out);
}

std::size_t giveOrphansNearestJoint(const Mesh& mesh, const std::vector<Bone>& bones, Weights& weights) {
  std::vector<std::int64_t> owner(weights.numVertices(), -1);
  std::size_t orphans = 0;
  for (std::size_t v = 0; v < weights.numVertices(); ++v) {
    if (weights.begin(v) != weights.end(v)) continue;
    ++orphans;
    double bestDistance = std::numeric_limits<double>::infinity();
    for (std::uint32_t b = 0; b < bones.size(); ++b) {
      const auto& m = bones[b].bindPose;
      const double dx = m[3] - mesh.positions[v][0], dy = m[7] - mesh.positions[v][1],
                   dz = m[11] - mesh.positions[v][2];
      const double d = dx * dx + dy * dy + dz * dz;
      if (d < bestDistance) {
        bestDistance = d;
        owner[v] = b;
      }
    }
  }
  if (orphans > 0) giveWholly(owner, weights);
  return orphans;
}

}  // namespace TessikSDK::Pipeline

#include "pipeline/influences.h"

#include <algorithm>
#include <limits>

namespace TessikSDK::Pipeline {

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

std::size_t giveOrphansNearestJoint(const Mesh& mesh, const std::vector<Bone>& bones, Weights& weights) {
  std::size_t orphans = 0;
  Weights filled;
  filled.offsets.reserve(weights.offsets.size());
  for (std::size_t v = 0; v < weights.numVertices(); ++v) {
    if (weights.begin(v) == weights.end(v)) {
      ++orphans;
      std::uint32_t best = 0;
      double bestDistance = std::numeric_limits<double>::infinity();
      for (std::uint32_t b = 0; b < bones.size(); ++b) {
        const auto& m = bones[b].bindPose;
        const double dx = m[3] - mesh.positions[v][0], dy = m[7] - mesh.positions[v][1],
                     dz = m[11] - mesh.positions[v][2];
        const double d = dx * dx + dy * dy + dz * dz;
        if (d < bestDistance) {
          bestDistance = d;
          best = b;
        }
      }
      filled.influences.push_back({best, 1.0});
    } else {
      filled.influences.insert(filled.influences.end(), weights.influences.begin() + weights.begin(v),
                               weights.influences.begin() + weights.end(v));
    }
    filled.offsets.push_back(static_cast<std::uint32_t>(filled.influences.size()));
  }
  weights = std::move(filled);
  return orphans;
}

}  // namespace TessikSDK::Pipeline

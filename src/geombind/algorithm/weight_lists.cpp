#include "geombind/algorithm/weight_lists.h"

#include <algorithm>

#include "geombind/parallel.h"

namespace TessikSDK::GeomBind::Algorithm {

void normalizeWeights(std::vector<BoneWeight>& weights) {
  double sum = 0.0;
  for (const BoneWeight& w : weights) sum += w.weight;
  if (sum == 0.0) return;
  const double scale = 1.0 / sum;
  for (BoneWeight& w : weights) w.weight *= scale;
}

void normalizeAllWeights(VertexWeights& weights) {
  if (weights.empty()) return;
  const std::int64_t count = static_cast<std::int64_t>(weights.size());
#pragma omp parallel for schedule(static)
  for (std::int64_t i = 0; i < count; ++i) normalizeWeights(weights[static_cast<std::size_t>(i)]);
}

void truncateWeights(std::int32_t limit, VertexWeights& weights) {
  if (weights.empty() || limit < 1) return;
  const std::int64_t count = static_cast<std::int64_t>(weights.size());
#pragma omp parallel for schedule(static) num_threads(processorThreads())
  for (std::int64_t i = 0; i < count; ++i) {
    std::vector<BoneWeight>& list = weights[static_cast<std::size_t>(i)];
    if (static_cast<std::int64_t>(list.size()) <= limit) continue;
    // Ties go to the lower bone index so the kept set never depends on the sort's internals.
    std::sort(list.begin(), list.end(), [](const BoneWeight& a, const BoneWeight& b) {
      return a.weight > b.weight || (a.weight == b.weight && a.boneIndex < b.boneIndex);
    });
    list.resize(static_cast<std::size_t>(limit));
    normalizeWeights(list);
  }
}

}  // namespace TessikSDK::GeomBind::Algorithm

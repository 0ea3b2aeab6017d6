#pragma once

#include <cstdint>
#include <vector>

#include "geombind/sparse_vertex_weights.h"

// Weight-list routines both binding methods finish with.
namespace TessikSDK::GeomBind::Algorithm {

/// Scales the list to sum 1 (one reciprocal of the sum, then products). A list whose weights sum to
/// exactly 0, an empty one included, is left as it is.
void normalizeWeights(std::vector<BoneWeight>& weights);

/// normalizeWeights on every vertex's list, in parallel.
void normalizeAllWeights(VertexWeights& weights);

/// Keeps the `limit` strongest influences of every list longer than `limit`, sorted by weight, largest
/// first, ties by ascending bone index, and renormalised. Shorter lists stay exactly as they are (in
/// bone order). A limit below 1 keeps everything.
void truncateWeights(std::int32_t limit, VertexWeights& weights);

}  // namespace TessikSDK::GeomBind::Algorithm

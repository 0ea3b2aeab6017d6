#pragma once

#include <cstdint>

#include "geombind/algorithm/bind_strategy.h"

namespace TessikSDK::GeomBind::Algorithm {

struct HeatmapOptions : IBindOptions {
  std::int32_t influenceLimit = 0;  ///< below 1 keeps every influence
  float falloff = 0.0f;             ///< 0: distance, 1: distance squared
};

/// Area-weighted vertex normals, unit length. A vertex no triangle uses keeps the normal (0, 0, 0).
void computeVertexNormals(MeshData& mesh);

/// Heat-diffusion binding. Not available yet in this build: bind returns an empty list.
class HeatmapBind : public IBindStrategy {
 public:
  ~HeatmapBind() override;
  VertexWeights bind(const MeshData& mesh,
                     HierarchyData& hierarchy,
                     const IBindOptions& options,
                     IProgress& progress) override;
};

}  // namespace TessikSDK::GeomBind::Algorithm

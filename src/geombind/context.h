#pragma once

#include "tessik/geombind.h"

#include "geombind/algorithm/geodesic/voxel_grid.h"
#include "geombind/sparse_vertex_weights.h"

namespace TessikSDK::GeomBind {

/// Clamps a falloff to [0, 1]: first the larger of 0 and the value, then the smaller of 1 and that. A NaN
/// falloff comes out as 0.
float clampFalloff(float falloff);

class ContextImpl : public IContext {
 public:
  explicit ContextImpl(Algorithm::InteriorVoxelizer voxelizer = Algorithm::InteriorVoxelizer::gpu)
      : voxelizer(voxelizer) {}
  ~ContextImpl() override;

  void reserved() override;
  ISparseVertexWeights* bindGeodesicSparseVoxel(IMesh* mesh,
                                                ITransformHierarchy* hierarchy,
                                                IProgress* progress,
                                                float falloff,
                                                unsigned int influenceLimit,
                                                int resolution,
                                                bool refineInterior) override;
  ISparseVertexWeights* bindHeatmap(IMesh* mesh,
                                    ITransformHierarchy* hierarchy,
                                    IProgress* progress,
                                    float falloff,
                                    unsigned int influenceLimit) override;

  SparseVertexWeightsImpl result;
  /// gpu for contexts made by create, cpu for those made by createWithoutOpenGL.
  Algorithm::InteriorVoxelizer voxelizer;
};

}  // namespace TessikSDK::GeomBind

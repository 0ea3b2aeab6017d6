#pragma once

#include "tessik/geombind.h"

#include "geombind/algorithm/geodesic/voxel_grid.h"
#include "geombind/mesh.h"
#include "geombind/preparation.h"
#include "geombind/sparse_vertex_weights.h"
#include "geombind/transform_hierarchy.h"

namespace TessikSDK::GeomBind {

/// Clamps a falloff to [0, 1]: first the larger of 0 and the value, then the smaller of 1 and that. A NaN
/// falloff comes out as 0.
float clampFalloff(float falloff);

/// The host's mesh and bones as a binding method reads them; both null when the binding is refused.
struct BindInputs {
  MeshData* mesh = nullptr;
  HierarchyData* hierarchy = nullptr;
};

/// What both bind entry points do before their method runs: put back what the host added (an earlier
/// binding rewrote it), refuse a mesh the methods could not read safely, leaving mesh and bones untouched,
/// and otherwise prepare both in place for `mode`; heat-map mode also gives every vertex its normal.
/// Objects the host made itself rather than through the factories are refused.
BindInputs prepareBindInputs(IMesh* mesh, ITransformHierarchy* hierarchy, PreparationMode mode);

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

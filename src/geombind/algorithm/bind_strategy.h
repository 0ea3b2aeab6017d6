#pragma once

#include "tessik/geombind.h"

#include "geombind/mesh.h"
#include "geombind/sparse_vertex_weights.h"
#include "geombind/transform_hierarchy.h"

namespace TessikSDK::GeomBind::Algorithm {

/// Base of each method's option record; a method recognises its own by a dynamic type test.
class IBindOptions {
 public:
  virtual ~IBindOptions();
};

/// A binding method. `bind` reads the prepared mesh, may move joints in the hierarchy, and returns one
/// weight list per vertex, or an empty list when it fails or is cancelled.
class IBindStrategy {
 public:
  virtual ~IBindStrategy();
  virtual VertexWeights bind(const MeshData& mesh,
                             HierarchyData& hierarchy,
                             const IBindOptions& options,
                             IProgress& progress) = 0;
};

}  // namespace TessikSDK::GeomBind::Algorithm

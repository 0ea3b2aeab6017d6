#pragma once

#include <vector>

#include "tessik/geombind.h"

namespace TessikSDK::GeomBind {

/// Per vertex, in vertex order, the (bone, weight) records a binding produced.
using VertexWeights = std::vector<std::vector<BoneWeight>>;

class SparseVertexWeightsImpl : public ISparseVertexWeights {
 public:
  ~SparseVertexWeightsImpl() override;

  std::size_t numVertices() override;
  unsigned int numWeights(unsigned int vertex) override;
  BoneWeight getWeight(unsigned int vertex, unsigned int index) override;

  VertexWeights perVertex;
};

}  // namespace TessikSDK::GeomBind

#include "geombind/sparse_vertex_weights.h"

namespace TessikSDK::GeomBind {

ISparseVertexWeights::~ISparseVertexWeights() = default;

SparseVertexWeightsImpl::~SparseVertexWeightsImpl() = default;

std::size_t SparseVertexWeightsImpl::numVertices() { return perVertex.size(); }

// Hosts loop over these getters with their own counts; a stale count must not read past the lists.
unsigned int SparseVertexWeightsImpl::numWeights(unsigned int vertex) {
  return vertex < perVertex.size() ? static_cast<unsigned int>(perVertex[vertex].size()) : 0u;
}

BoneWeight SparseVertexWeightsImpl::getWeight(unsigned int vertex, unsigned int index) {
  if (vertex >= perVertex.size() || index >= perVertex[vertex].size()) return BoneWeight{0, 0.0};
  return perVertex[vertex][index];
}

}  // namespace TessikSDK::GeomBind

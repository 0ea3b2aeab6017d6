#include "geombind/mesh.h"

namespace TessikSDK::GeomBind {

IMesh::~IMesh() = default;

IMesh* IMesh::create() { return new MeshImpl(); }

void IMesh::dispose(IMesh* mesh) { delete mesh; }

MeshImpl::~MeshImpl() = default;

void MeshImpl::addVertex(float x, float y, float z) {
  data.boundingBox.extend(glm::dvec3(x, y, z));
  VertexRecord vertex;
  vertex.position = {x, y, z};
  data.vertices.push_back(vertex);
  addedBox_.extend(glm::dvec3(x, y, z));
  addedVertices_.push_back(vertex);
}

void MeshImpl::addTriangle(unsigned int a, unsigned int b, unsigned int c) {
  data.triangles.push_back({a, b, c});
  addedTriangles_.push_back({a, b, c});
}

void MeshImpl::restoreAdded() {
  if (!prepared) return;
  data.vertices = addedVertices_;
  data.triangles = addedTriangles_;
  data.boundingBox = addedBox_;
  data.normalizeOffset = {0.0f, 0.0f, 0.0f};
  data.normalizeScale = 1.0f;
  prepared = false;
}

}  // namespace TessikSDK::GeomBind

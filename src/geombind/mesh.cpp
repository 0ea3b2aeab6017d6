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
}

void MeshImpl::addTriangle(unsigned int a, unsigned int b, unsigned int c) {
  data.triangles.push_back({a, b, c});
}

}  // namespace TessikSDK::GeomBind

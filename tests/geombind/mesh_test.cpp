#include "geombind/mesh.h"

#include <gtest/gtest.h>

namespace {

using TessikSDK::GeomBind::IMesh;
using TessikSDK::GeomBind::MeshImpl;

TEST(Mesh, StartsEmptyWithNeutralNormalisation) {
  MeshImpl mesh;
  EXPECT_TRUE(mesh.data.vertices.empty());
  EXPECT_TRUE(mesh.data.triangles.empty());
  EXPECT_GT(mesh.data.boundingBox.lower.x, mesh.data.boundingBox.upper.x);
  EXPECT_EQ(mesh.data.normalizeScale, 1.0f);
  EXPECT_EQ(mesh.data.normalizeOffset[0], 0.0f);
}

TEST(Mesh, VerticesGrowTheBoxAndKeepTheirOrder) {
  IMesh* mesh = IMesh::create();
  mesh->addVertex(1, 2, 3);
  mesh->addVertex(-1, 5, 0);
  mesh->addTriangle(0, 1, 0);
  mesh->addTriangle(0, 1, 0);
  const auto& data = static_cast<MeshImpl*>(mesh)->data;
  EXPECT_EQ(data.boundingBox.lower, glm::dvec3(-1, 2, 0));
  EXPECT_EQ(data.boundingBox.upper, glm::dvec3(1, 5, 3));
  ASSERT_EQ(data.vertices.size(), 2u);
  EXPECT_EQ(data.vertices[1].position[1], 5.0f);
  EXPECT_EQ(data.vertices[1].normal[0], 0.0f);
  EXPECT_EQ(data.triangles.size(), 2u) << "duplicates are kept";
  IMesh::dispose(mesh);
  IMesh::dispose(nullptr);
}

}  // namespace

#include "geombind/algorithm/heatmap/heatmap_bind.h"

#include <cmath>

#include <gtest/gtest.h>

#include "geombind/mesh.h"

namespace {

using namespace TessikSDK::GeomBind;

TEST(HeatmapNormals, AreaWeightedUnitNormalsAndZeroForIsolatedVertices) {
  MeshImpl mesh;
  // A big triangle facing +z and a small one facing +x share vertex 0; vertex 5 is unused.
  mesh.addVertex(0, 0, 0);
  mesh.addVertex(4, 0, 0);
  mesh.addVertex(0, 4, 0);
  mesh.addVertex(0, 1, 0);
  mesh.addVertex(0, 0, 1);
  mesh.addVertex(9, 9, 9);
  mesh.addTriangle(0, 1, 2);
  mesh.addTriangle(0, 3, 4);
  mesh.data.vertices[5].normal = {1, 1, 1};
  Algorithm::computeVertexNormals(mesh.data);
  // Cross products (0, 0, 16) and (1, 0, 0): the shared vertex leans toward the bigger triangle.
  const float length = std::sqrt(16.0f * 16.0f + 1.0f);
  EXPECT_FLOAT_EQ(mesh.data.vertices[0].normal[0], 1.0f / length);
  EXPECT_FLOAT_EQ(mesh.data.vertices[0].normal[2], 16.0f / length);
  EXPECT_FLOAT_EQ(mesh.data.vertices[1].normal[2], 1.0f);
  EXPECT_FLOAT_EQ(mesh.data.vertices[3].normal[0], 1.0f);
  for (float c : mesh.data.vertices[5].normal) EXPECT_EQ(c, 0.0f);
}

}  // namespace

#include "geombind/context.h"

#include <array>
#include <cmath>
#include <limits>
#include <vector>

#include <gtest/gtest.h>

#include "geombind/mesh.h"
#include "geombind/transform_hierarchy.h"

namespace {

using namespace TessikSDK::GeomBind;

// Records every call, as a host's progress object would see them.
class RecordingProgress : public IProgress {
 public:
  void begin(const char* title, int, int) override { calls.push_back(std::string("begin ") + title); }
  void end() override { calls.push_back("end"); }
  void setRange(int, int) override { calls.push_back("setRange"); }
  bool update(int) override { return false; }
  bool isCanceled() override { return false; }
  std::vector<std::string> calls;
};

class Context : public ::testing::Test {
 protected:
  void SetUp() override {
    for (float x : {0.0f, 2.0f})
      for (float y : {0.0f, 1.0f}) mesh->addVertex(x, y, 0.5f);
    mesh->addTriangle(0, 2, 1);
    mesh->addTriangle(1, 2, 3);
    const double root[16] = {1, 0, 0, 0.5, 0, 1, 0, 0.5, 0, 0, 1, 0.5, 0, 0, 0, 1};
    ASSERT_TRUE(bones->addNode("root", root, nullptr));
  }
  MeshData& meshData() { return static_cast<MeshImpl*>(mesh)->data; }
  HierarchyData& boneData() { return static_cast<TransformHierarchyImpl*>(bones)->data; }

  // Runs both bindings and says whether they left the inputs exactly as they were.
  void expectRefusedUnchanged() {
    const std::vector<VertexRecord> vertices = meshData().vertices;
    const Matrix4 joint = boneData().transforms[0];
    for (int method = 0; method < 2; ++method) {
      ISparseVertexWeights* result =
          method == 0 ? context.bindHeatmap(mesh, bones, &progress, 0.5f, 4)
                      : context.bindGeodesicSparseVoxel(mesh, bones, &progress, 0.5f, 4, 64, false);
      ASSERT_EQ(result, &context.result);
      EXPECT_EQ(result->numVertices(), 0u);
      EXPECT_TRUE(meshData().edges.empty()) << "mesh was prepared";
      EXPECT_EQ(meshData().normalizeScale, 1.0f);
      EXPECT_EQ(boneData().transforms[0], joint);
      for (std::size_t v = 0; v < vertices.size(); ++v) {
        for (int k = 0; k < 3; ++k) {
          const float before = vertices[v].position[k], after = meshData().vertices[v].position[k];
          EXPECT_TRUE(before == after || (std::isnan(before) && std::isnan(after))) << "vertex " << v;
        }
      }
    }
    EXPECT_TRUE(progress.calls.empty());
  }

  ContextImpl context;
  IMesh* mesh = IMesh::create();
  ITransformHierarchy* bones = ITransformHierarchy::create();
  RecordingProgress progress;

  void TearDown() override {
    IMesh::dispose(mesh);
    ITransformHierarchy::dispose(bones);
  }
};

TEST_F(Context, MissingInputGivesTheEmptyResult) {
  context.result.perVertex.assign(3, {BoneWeight{1, 0.5}});
  EXPECT_EQ(context.bindHeatmap(nullptr, bones, nullptr, 0.5f, 4), &context.result);
  EXPECT_EQ(context.result.numVertices(), 0u) << "the previous result must be cleared first";
  EXPECT_EQ(context.bindGeodesicSparseVoxel(mesh, nullptr, nullptr, 0.5f, 4, 64, false), &context.result);
  EXPECT_EQ(context.result.numVertices(), 0u);
}

TEST_F(Context, BindingPreparesMeshAndHierarchyInPlace) {
  context.bindHeatmap(mesh, bones, &progress, 0.5f, 4);
  EXPECT_EQ(meshData().normalizeScale, 0.5f);
  EXPECT_EQ(meshData().edges.size(), 6u);
  EXPECT_EQ(boneData().transforms[0][12], 0.25);
  // Heat-map bindings also give every vertex a unit normal; this quad is wound to face +z.
  EXPECT_FLOAT_EQ(meshData().vertices[0].normal[2], 1.0f);
}

TEST_F(Context, TriangleNamingAMissingVertexIsRefused) {
  mesh->addTriangle(0, 1, 4);
  expectRefusedUnchanged();
}

TEST_F(Context, NonFiniteCoordinateIsRefused) {
  mesh->addVertex(std::numeric_limits<float>::quiet_NaN(), 0, 0);
  expectRefusedUnchanged();
}

TEST_F(Context, CoincidentVerticesAreRefused) {
  IMesh::dispose(mesh);
  mesh = IMesh::create();
  for (int i = 0; i < 3; ++i) mesh->addVertex(1, 1, 1);
  mesh->addTriangle(0, 1, 2);
  expectRefusedUnchanged();
}

TEST(ContextFalloff, ClampsToTheUnitRange) {
  EXPECT_EQ(clampFalloff(-3.0f), 0.0f);
  EXPECT_EQ(clampFalloff(7.0f), 1.0f);
  EXPECT_EQ(clampFalloff(0.25f), 0.25f);
  EXPECT_EQ(clampFalloff(std::numeric_limits<float>::quiet_NaN()), 0.0f);
}

TEST(ContextResult, OutOfRangeGettersReadNothing) {
  SparseVertexWeightsImpl weights;
  weights.perVertex = {{BoneWeight{3, 0.75}, BoneWeight{1, 0.25}}, {}};
  EXPECT_EQ(weights.numVertices(), 2u);
  EXPECT_EQ(weights.numWeights(0), 2u);
  EXPECT_EQ(weights.getWeight(0, 1).boneIndex, 1u);
  EXPECT_EQ(weights.numWeights(2), 0u);
  for (auto [v, i] : std::vector<std::array<unsigned, 2>>{{0, 2}, {1, 0}, {2, 0}, {0xFFFFFFFFu, 0}}) {
    const BoneWeight w = weights.getWeight(v, i);
    EXPECT_EQ(w.boneIndex, 0u);
    EXPECT_EQ(w.weight, 0.0);
  }
}

}  // namespace

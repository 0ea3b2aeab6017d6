#include "geombind/algorithm/heatmap/heatmap_bind.h"

#include <algorithm>
#include <cmath>
#include <mutex>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "geombind/context.h"
#include "geombind/mesh.h"
#include "geombind/transform_hierarchy.h"
#include "meshes/mesh_builders.h"

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

using tessik::meshes::TriMesh;

class Recording : public IProgress {
 public:
  explicit Recording(bool cancel) : cancel(cancel) {}
  void begin(const char* title, int, int) override { calls.push_back(std::string("begin ") + title); }
  void end() override { calls.push_back("end"); }
  void setRange(int, int) override {}
  bool update(int value) override {
    std::lock_guard<std::mutex> lock(mutex);
    calls.push_back("update " + std::to_string(value));
    return false;
  }
  bool isCanceled() override { return cancel; }
  std::mutex mutex;
  std::vector<std::string> calls;
  bool cancel;
};

// Binds through the context, as a host does (the heat-map method needs no OpenGL context).
std::vector<std::vector<BoneWeight>> bindHeat(const TriMesh& shape,
                                              const std::vector<std::pair<double, const char*>>& chainX,
                                              unsigned limit,
                                              IProgress* progress = nullptr) {
  ContextImpl context;
  MeshImpl mesh;
  TransformHierarchyImpl bones;
  for (const auto& p : shape.positions) mesh.addVertex(p[0], p[1], p[2]);
  for (const auto& t : shape.triangles) mesh.addTriangle(t[0], t[1], t[2]);
  const char* parent = nullptr;
  for (const auto& [x, name] : chainX) {
    const double m[16] = {1, 0, 0, x, 0, 1, 0, 0, 0, 0, 1, 0, 0, 0, 0, 1};
    bones.addNode(name, m, parent);
    parent = name;
  }
  ISparseVertexWeights* result = context.bindHeatmap(&mesh, &bones, progress, 0.0f, limit);
  std::vector<std::vector<BoneWeight>> out(result->numVertices());
  for (unsigned v = 0; v < out.size(); ++v)
    for (unsigned k = 0; k < result->numWeights(v); ++k) out[v].push_back(result->getWeight(v, k));
  return out;
}

TEST(HeatmapBind, TwoBoneChainNamesOnlyItsBones) {
  const TriMesh arm = tessik::meshes::cylinderX(0.0f, 2.0f, 0.0f, 0.0f, 0.2f, 16, 12);
  const auto weights = bindHeat(arm, {{0.2, "root"}, {1.8, "tip"}}, 0);
  ASSERT_EQ(weights.size(), arm.positions.size());
  for (const auto& list : weights) {
    ASSERT_FALSE(list.empty());
    for (const BoneWeight& w : list) EXPECT_LT(w.boneIndex, 2u);
  }
}

TEST(HeatmapBind, ArmWeightsSumToOneAndFallOffAlongTheArm) {
  const TriMesh arm = tessik::meshes::cylinderX(0.0f, 2.0f, 0.0f, 0.0f, 0.2f, 40, 16);
  const auto weights = bindHeat(arm, {{0.1, "upper"}, {1.0, "fore"}, {1.9, "hand"}}, 2);
  ASSERT_EQ(weights.size(), arm.positions.size());
  std::vector<std::pair<float, double>> upperAlongTop;  // (x, weight of bone 0) on the line y = r
  for (std::size_t v = 0; v < weights.size(); ++v) {
    double sum = 0.0, upper = 0.0;
    EXPECT_LE(weights[v].size(), 2u);
    for (const BoneWeight& w : weights[v]) {
      sum += w.weight;
      if (w.boneIndex == 0) upper = w.weight;
    }
    EXPECT_NEAR(sum, 1.0, 1e-9) << v;
    if (arm.positions[v][1] > 0.199f && v < 41 * 16) upperAlongTop.emplace_back(arm.positions[v][0], upper);
  }
  std::sort(upperAlongTop.begin(), upperAlongTop.end());
  for (std::size_t k = 1; k < upperAlongTop.size(); ++k) {
    if (upperAlongTop[k - 1].first >= 0.55f) {
      EXPECT_LE(upperAlongTop[k].second, upperAlongTop[k - 1].second + 1e-6) << upperAlongTop[k].first;
    }
  }
  EXPECT_GT(upperAlongTop.front().second, 0.9);
  EXPECT_LT(upperAlongTop.back().second, 0.1);
}

TEST(HeatmapBind, OneTinyTriangleEmptiesTheResult) {
  TriMesh arm = tessik::meshes::cylinderX(0.0f, 2.0f, 0.0f, 0.0f, 0.2f, 8, 8);
  // Area 2e-10 here; the unit frame scales lengths by 1 / 3.2, leaving about 2e-11, below the 1e-10 limit.
  const auto a = arm.add(0.0f, 3.0f, 0.0f), b = arm.add(2e-5f, 3.0f, 0.0f),
             c = arm.add(0.0f, 3.0f + 2e-5f, 0.0f);
  arm.triangles.push_back({a, b, c});
  EXPECT_TRUE(bindHeat(arm, {{0.5, "root"}, {1.5, "tip"}}, 4).empty());
}

TEST(HeatmapBind, CancelledFromTheStartClosesWhatItOpened) {
  const TriMesh arm = tessik::meshes::cylinderX(0.0f, 2.0f, 0.0f, 0.0f, 0.2f, 8, 8);
  Recording progress(true);
  EXPECT_TRUE(bindHeat(arm, {{0.5, "root"}, {1.5, "tip"}}, 4, &progress).empty());
  EXPECT_EQ(progress.calls, (std::vector<std::string>{"begin Computing Heatmap weights ... ", "update 0",
                                                      "update 1", "end"}));
}

}  // namespace

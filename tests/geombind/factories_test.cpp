#include <memory>
#include <thread>
#include <utility>
#include <vector>

#include <gtest/gtest.h>

#include "tessik/geombind.h"

#include "meshes/mesh_builders.h"
#include "support/gl_context_fixture.h"

namespace {

using namespace TessikSDK::GeomBind;

using ContextPtr = std::unique_ptr<IContext, decltype(&IContext::dispose)>;

class Factories : public tessik::test::GLContextTest {};

TEST_F(Factories, ContextNeedsACurrentGLContext) {
  ContextPtr context(IContext::create(), &IContext::dispose);
  EXPECT_NE(context, nullptr);

  IContext* elsewhere = reinterpret_cast<IContext*>(1);
  std::thread([&] { elsewhere = IContext::create(); }).join();  // a fresh thread has no current context
  EXPECT_EQ(elsewhere, nullptr);
  IContext::dispose(nullptr);
}

TEST_F(Factories, EveryBindingReturnsTheContextsOneResult) {
  ContextPtr context(IContext::create(), &IContext::dispose);
  ASSERT_NE(context, nullptr);
  std::unique_ptr<IMesh, decltype(&IMesh::dispose)> mesh(IMesh::create(), &IMesh::dispose);
  std::unique_ptr<ITransformHierarchy, decltype(&ITransformHierarchy::dispose)> bones(
      ITransformHierarchy::create(), &ITransformHierarchy::dispose);
  context->reserved();
  ISparseVertexWeights* first = context->bindHeatmap(mesh.get(), bones.get(), nullptr, 0.5f, 4);
  ISparseVertexWeights* second =
      context->bindGeodesicSparseVoxel(nullptr, bones.get(), nullptr, 0.5f, 4, 64, true);
  ASSERT_NE(first, nullptr);
  EXPECT_EQ(first, second);
  EXPECT_EQ(second->numVertices(), 0u);
}

// Binding rewrites the mesh and hierarchy into its unit frame; a second binding of the same objects must
// start from what the host added, or the geodesic padding would shift every position again.
TEST_F(Factories, BindingTheSameObjectsAgainGivesTheSameWeights) {
  ContextPtr context(IContext::create(), &IContext::dispose);
  ASSERT_NE(context, nullptr);
  std::unique_ptr<IMesh, decltype(&IMesh::dispose)> mesh(IMesh::create(), &IMesh::dispose);
  std::unique_ptr<ITransformHierarchy, decltype(&ITransformHierarchy::dispose)> bones(
      ITransformHierarchy::create(), &ITransformHierarchy::dispose);
  const tessik::meshes::TriMesh tube = tessik::meshes::cylinderX(0.0f, 3.0f, 0.0f, 0.0f, 0.3f, 24, 16);
  for (const auto& p : tube.positions) mesh->addVertex(p[0], p[1], p[2]);
  for (const auto& t : tube.triangles) mesh->addTriangle(t[0], t[1], t[2]);
  const double a[16] = {1, 0, 0, 0.3, 0, 1, 0, 0, 0, 0, 1, 0, 0, 0, 0, 1};
  const double b[16] = {1, 0, 0, 1.6, 0, 1, 0, 0, 0, 0, 1, 0, 0, 0, 0, 1};
  ASSERT_TRUE(bones->addNode("a", a, nullptr));
  ASSERT_TRUE(bones->addNode("b", b, "a"));

  using Lists = std::vector<std::vector<std::pair<unsigned, double>>>;
  auto bind = [&] {
    ISparseVertexWeights* result =
        context->bindGeodesicSparseVoxel(mesh.get(), bones.get(), nullptr, 0.5f, 4, 64, false);
    Lists lists(result->numVertices());
    for (unsigned v = 0; v < lists.size(); ++v)
      for (unsigned i = 0; i < result->numWeights(v); ++i)
        lists[v].emplace_back(result->getWeight(v, i).boneIndex, result->getWeight(v, i).weight);
    return lists;
  };
  setConsoleReports(false);
  const Lists first = bind();
  const Lists second = bind();
  setConsoleReports(true);
  ASSERT_EQ(first.size(), tube.positions.size());
  EXPECT_EQ(first, second);
}

}  // namespace

#include <memory>
#include <thread>

#include <gtest/gtest.h>

#include "tessik/geombind.h"

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

}  // namespace

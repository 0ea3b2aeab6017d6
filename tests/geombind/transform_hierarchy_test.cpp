#include "geombind/transform_hierarchy.h"

#include <array>

#include <gtest/gtest.h>

namespace {

using TessikSDK::GeomBind::TransformHierarchyImpl;

// Row-major input: identity with a translation in elements 3, 7 and 11.
std::array<double, 16> moved(double x, double y, double z) {
  return {1, 0, 0, x, 0, 1, 0, y, 0, 0, 1, z, 0, 0, 0, 1};
}

class Hierarchy : public ::testing::Test {
 protected:
  TransformHierarchyImpl h;
};

TEST_F(Hierarchy, StoresMatricesColumnByColumn) {
  std::array<double, 16> m;
  for (int i = 0; i < 16; ++i) m[i] = i;
  ASSERT_TRUE(h.addNode("a", m.data(), nullptr));
  for (int r = 0; r < 4; ++r)
    for (int c = 0; c < 4; ++c) EXPECT_EQ(h.data.transforms[0][4 * c + r], m[4 * r + c]);
  ASSERT_TRUE(h.addNode("b", moved(5, 6, 7).data(), nullptr));
  EXPECT_EQ(h.data.transforms[1][12], 5);
  EXPECT_EQ(h.data.transforms[1][13], 6);
  EXPECT_EQ(h.data.transforms[1][14], 7);
}

TEST_F(Hierarchy, RepeatedNameIsRefusedAndKeepsTheFirst) {
  EXPECT_TRUE(h.addNode("spine", moved(1, 0, 0).data(), nullptr));
  EXPECT_FALSE(h.addNode("spine", moved(2, 0, 0).data(), "root"));
  EXPECT_EQ(h.data.nodeCount(), 1u);
  EXPECT_EQ(h.data.transforms[0][12], 1);
  EXPECT_EQ(h.data.parentIndex(0), -1);
}

TEST_F(Hierarchy, RefusesNodesItCannotStore) {
  EXPECT_FALSE(h.addNode("", moved(0, 0, 0).data(), nullptr));
  EXPECT_FALSE(h.addNode(nullptr, moved(0, 0, 0).data(), nullptr));
  EXPECT_FALSE(h.addNode("no_matrix", nullptr, nullptr));
  EXPECT_EQ(h.data.nodeCount(), 0u);
  EXPECT_TRUE(h.data.names.empty());
  EXPECT_TRUE(h.data.parentNames.empty());
}

TEST_F(Hierarchy, ParentsResolveByNameWhenAsked) {
  ASSERT_TRUE(h.addNode("hand", moved(0, 0, 0).data(), "arm"));
  EXPECT_EQ(h.data.parentIndex(0), -1) << "parent not added yet";
  ASSERT_TRUE(h.addNode("arm", moved(0, 0, 0).data(), ""));
  EXPECT_EQ(h.data.parentIndex(0), 1);
  EXPECT_EQ(h.data.parentIndex(1), -1);
  ASSERT_TRUE(h.addNode("loop", moved(0, 0, 0).data(), "loop"));
  EXPECT_EQ(h.data.parentIndex(2), 2) << "a node named as its own parent is taken as given";
}

TEST_F(Hierarchy, ClearForgetsEveryNameAndIndex) {
  ASSERT_TRUE(h.addNode("a", moved(0, 0, 0).data(), nullptr));
  ASSERT_TRUE(h.addNode("b", moved(0, 0, 0).data(), "a"));
  h.clear();
  EXPECT_EQ(h.data.nodeCount(), 0u);
  ASSERT_TRUE(h.addNode("b", moved(0, 0, 0).data(), "a"));
  EXPECT_EQ(h.data.nameToIndex.at("b"), 0u);
  EXPECT_EQ(h.data.parentIndex(0), -1) << "the old parent is gone";
}

}  // namespace

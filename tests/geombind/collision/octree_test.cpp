#include "geombind/collision/octree.h"

#include <map>
#include <memory>
#include <random>
#include <set>
#include <vector>

#include <gtest/gtest.h>

#include "geombind/collision/intersection.h"

namespace {

using namespace TessikSDK::GeomBind::Collision;

// Gathers what a build produced by walking the tree through accept, as the library's visitors do.
class StructureVisitor : public IOctreeConstVisitor {
 public:
  void visit(const Octant& octant) override {
    ++perDepth[octant.depth];
    path.push_back(&octant);
    if (octant.children().empty()) {
      leaves.push_back(&octant);
      if (!octant.elements().empty()) ancestry[&octant] = path;
    } else {
      EXPECT_EQ(octant.children().size(), 8u);
      EXPECT_TRUE(octant.elements().empty()) << "an inner octant kept elements";
      const glm::dvec3 c = (octant.bounds.lower + octant.bounds.upper) * 0.5;
      for (int i = 0; i < 8; ++i) {
        const Octant& child = *octant.children()[i];
        EXPECT_EQ(child.depth, octant.depth + 1);
        for (int k = 0; k < 3; ++k) {
          const bool upper = ((i >> k) & 1) != 0;
          EXPECT_EQ(child.bounds.lower[k], upper ? c[k] : octant.bounds.lower[k]) << "child " << i;
          EXPECT_EQ(child.bounds.upper[k], upper ? octant.bounds.upper[k] : c[k]) << "child " << i;
        }
        child.accept(*this);
      }
    }
    path.pop_back();
  }

  std::map<int, int> perDepth;
  std::vector<const Octant*> leaves;
  std::map<const Octant*, std::vector<const Octant*>> ancestry;

 private:
  std::vector<const Octant*> path;
};

StructureVisitor walk(const Octree& tree) {
  StructureVisitor visitor;
  tree.accept(visitor);
  return visitor;
}

// Counts live instances so the tests can see the tree delete what it owns.
class CountedPoint : public OctreeElement<glm::dvec3> {
 public:
  static inline int live = 0;
  explicit CountedPoint(const glm::dvec3& p) : OctreeElement(p) { ++live; }
  ~CountedPoint() override { --live; }
};

class OctreeTest : public ::testing::Test {
 protected:
  void SetUp() override {
    CountedPoint::live = 0;
    tree.reset(AABB({0, 0, 0}, {8, 8, 8}));
  }
  Octree tree;
};

TEST_F(OctreeTest, DepthZeroKeepsEverythingOnTheRoot) {
  for (int i = 0; i < 5; ++i) tree.insert(std::make_unique<CountedPoint>(glm::dvec3(i)));
  tree.insert(nullptr);
  tree.build(0, 0);
  EXPECT_TRUE(tree.children().empty());
  EXPECT_EQ(tree.elements().size(), 5u);
  EXPECT_EQ(tree.allElements().size(), 5u);
}

struct PointCase {
  const char* name;
  glm::dvec3 point;
  std::map<int, int> octantsPerDepth;
  size_t leavesHoldingIt;
};

void PrintTo(const PointCase& c, std::ostream* os) { *os << c.name; }

class OctreeSinglePoint : public OctreeTest, public ::testing::WithParamInterface<PointCase> {};

TEST_P(OctreeSinglePoint, SplitsOnlyWhereThePointIs) {
  tree.insert(std::make_unique<CountedPoint>(GetParam().point));
  tree.build(1, 3);
  const StructureVisitor v = walk(tree);
  EXPECT_EQ(v.perDepth, GetParam().octantsPerDepth);
  EXPECT_EQ(v.ancestry.size(), GetParam().leavesHoldingIt);
  for (const auto& [leaf, path] : v.ancestry) {
    EXPECT_EQ(leaf->depth, 3);
    EXPECT_TRUE(contains(leaf->bounds, GetParam().point));
  }
}

INSTANTIATE_TEST_SUITE_P(
    Collision,
    OctreeSinglePoint,
    ::testing::Values(PointCase{"inside_one_cell", {0.5, 3.5, 6.5}, {{0, 1}, {1, 8}, {2, 8}, {3, 8}}, 1},
                      PointCase{
                          "on_a_face_of_two_cells", {2, 3.5, 6.5}, {{0, 1}, {1, 8}, {2, 8}, {3, 16}}, 2},
                      PointCase{"on_the_centre_corner", {4, 4, 4}, {{0, 1}, {1, 8}, {2, 64}, {3, 64}}, 8}),
    [](const ::testing::TestParamInfo<PointCase>& info) { return std::string(info.param.name); });

TEST_F(OctreeTest, EmptyTreeSplitsDownToMinDepthOnly) {
  tree.build(2, 5);
  EXPECT_EQ(walk(tree).perDepth, (std::map<int, int>{{0, 1}, {1, 8}, {2, 64}}));
}

// Every element must sit in exactly the deepest leaves whose closed boxes it touches, compared with a
// brute-force test of every element against every leaf.
TEST_F(OctreeTest, ElementsSitInExactlyTheLeavesTheyTouch) {
  std::mt19937 rng(5);
  std::uniform_real_distribution<double> coord(0.0, 8.0);
  std::uniform_real_distribution<double> step(-1.5, 1.5);
  auto near = [&](const glm::dvec3& p) { return p + glm::dvec3(step(rng), step(rng), step(rng)); };
  for (int i = 0; i < 60; ++i) {
    const glm::dvec3 p(coord(rng), coord(rng), coord(rng));
    tree.add(p);
    tree.add(Segment(p, near(p)));
    tree.add(Triangle(p, near(p), near(p)));
  }
  tree.add(glm::dvec3(2, 4, 6));  // on cell corners at depth 3
  tree.build(0, 3);
  const StructureVisitor v = walk(tree);
  for (const Octant* leaf : v.leaves) {
    std::set<const IOctreeElement*> listed(leaf->elements().begin(), leaf->elements().end());
    EXPECT_EQ(listed.size(), leaf->elements().size()) << "element listed twice in one leaf";
    if (!listed.empty()) {
      EXPECT_EQ(leaf->depth, 3);
    }
    for (const auto& element : tree.allElements()) {
      EXPECT_EQ(listed.count(element.get()) == 1, element->intersects(leaf->bounds))
          << "leaf at depth " << int(leaf->depth);
    }
  }
  size_t cornerLeaves = 0;
  for (const Octant* leaf : v.leaves)
    for (const IOctreeElement* e : leaf->elements()) cornerLeaves += e == tree.allElements().back().get();
  EXPECT_EQ(cornerLeaves, 8u);

  // Inserted as point, segment, triangle in turn: each reads back as its own type only.
  for (std::size_t i = 0; i + 1 < tree.allElements().size(); ++i) {
    const IOctreeElement& e = *tree.allElements()[i];
    EXPECT_EQ(e.as<glm::dvec3>() != nullptr, i % 3 == 0) << i;
    EXPECT_EQ(e.as<Segment>() != nullptr, i % 3 == 1) << i;
    ASSERT_EQ(e.as<Triangle>() != nullptr, i % 3 == 2) << i;
    if (i % 3 == 0) {  // the same p began the segment and the triangle that follow it
      EXPECT_EQ(*e.as<glm::dvec3>(), tree.allElements()[i + 1]->as<Segment>()->a);
      EXPECT_EQ(*e.as<glm::dvec3>(), tree.allElements()[i + 2]->as<Triangle>()->a);
    }
  }
}

TEST(OctreeFlat, FlatMeshIsPaddedAndStillFound) {
  Octree tree;
  AABB bounds;
  const Triangle flat({0, 0, 2}, {4, 0, 2}, {0, 3, 2});
  bounds.extend(flat.a);
  bounds.extend(flat.b);
  bounds.extend(flat.c);
  tree.reset(bounds);
  EXPECT_DOUBLE_EQ(tree.bounds.upper.z - 2.0, static_cast<double>(0.5f));
  tree.add(flat);
  tree.build(0, 4);
  const StructureVisitor v = walk(tree);
  EXPECT_GT(v.ancestry.size(), 8u);
}

TEST_F(OctreeTest, ClearResetAndDestructionDeleteEveryElement) {
  for (int i = 0; i < 10; ++i) tree.insert(std::make_unique<CountedPoint>(glm::dvec3(i % 8)));
  tree.build(0, 2);
  tree.clear();
  EXPECT_EQ(CountedPoint::live, 0);
  EXPECT_TRUE(tree.children().empty());
  EXPECT_EQ(tree.bounds.upper, glm::dvec3(8));

  for (int i = 0; i < 10; ++i) tree.insert(std::make_unique<CountedPoint>(glm::dvec3(1)));
  tree.reset(AABB({0, 0, 0}, {1, 1, 1}));
  EXPECT_EQ(CountedPoint::live, 0);
  EXPECT_TRUE(tree.allElements().empty());

  {
    Octree scoped;
    scoped.reset(AABB({0, 0, 0}, {1, 1, 1}));
    for (int i = 0; i < 10; ++i) scoped.insert(std::make_unique<CountedPoint>(glm::dvec3(0.5)));
    scoped.build(0, 3);
  }
  EXPECT_EQ(CountedPoint::live, 0);
}

TEST_F(OctreeTest, SecondBuildWithoutInsertsLeavesElementsOut) {
  for (int i = 0; i < 4; ++i) tree.insert(std::make_unique<CountedPoint>(glm::dvec3(1 + i)));
  tree.build(0, 3);
  tree.build(0, 3);
  const StructureVisitor v = walk(tree);
  EXPECT_EQ(v.perDepth, (std::map<int, int>{{0, 1}, {1, 8}}));
  EXPECT_TRUE(v.ancestry.empty());
  EXPECT_EQ(tree.allElements().size(), 4u);
  EXPECT_EQ(CountedPoint::live, 4);
}

}  // namespace

#include "pipeline/piece_binding.h"

#include <gtest/gtest.h>

#include "pipeline/weld.h"

namespace TessikSDK::Pipeline {
namespace {

namespace gb = TessikSDK::GeomBind;

class CancelAfter final : public gb::IProgress {
 public:
  explicit CancelAfter(int updates) : left_(updates) {}
  void begin(const char*, int, int) override {}
  void end() override {}
  void setRange(int, int) override {}
  bool update(int) override {
    --left_;
    return true;
  }
  bool isCanceled() override { return left_ <= 0; }

 private:
  int left_;
};

// Small triangles strung along x, one piece each; a piece's place tells the fake binder how to treat it.
class PieceBindingTest : public ::testing::Test {
 protected:
  void SetUp() override {
    for (const float x : {-1.0f, 1.0f, 5.0f, -3.0f, 2.0f}) {
      const auto base = static_cast<std::uint32_t>(mesh_.positions.size());
      mesh_.positions.insert(mesh_.positions.end(), {{x, 0, 0}, {x + 0.1f, 0, 0}, {x, 0.1f, 0}});
      mesh_.triangles.push_back({base, base + 1, base + 2});
    }
    pieces_ = labelPieces(mesh_, pieceOf_);
  }

  // A group fails when it holds a vertex past x = 4 (a piece that sees no bone); otherwise each vertex
  // goes to joint 0 left of the origin and joint 1 right of it.
  GroupBinder fake() {
    return [this](const Mesh& group) {
      ++calls_;
      Weights w;
      for (const std::array<float, 3>& p : group.positions)
        if (p[0] > 4.0f) return Weights{};
      for (const std::array<float, 3>& p : group.positions) {
        w.influences.push_back({p[0] < 0.0f ? 0u : 1u, 1.0f});
        w.offsets.push_back(static_cast<std::uint32_t>(w.influences.size()));
      }
      return w;
    };
  }

  Mesh mesh_;
  std::vector<std::uint32_t> pieceOf_;
  std::size_t pieces_ = 0;
  int calls_ = 0;
};

TEST_F(PieceBindingTest, FailingPieceBorrowsFromItsNearestBoundNeighbour) {
  CancelAfter never(1 << 30);
  const PieceBinding r = bindInGroups(mesh_, pieceOf_, pieces_, fake(), never);
  ASSERT_EQ(pieces_, 5u);
  EXPECT_EQ(r.unboundPieces, 1u);
  ASSERT_EQ(r.weights.numVertices(), mesh_.positions.size());
  for (std::size_t v = 0; v < mesh_.positions.size(); ++v) {
    ASSERT_EQ(r.weights.end(v) - r.weights.begin(v), 1u) << v;
    // The piece at x = 5 lies nearest the one at x = 2, which joint 1 rules.
    EXPECT_EQ(r.weights.influences[r.weights.begin(v)].bone, mesh_.positions[v][0] < 0.0f ? 0u : 1u) << v;
  }
  // Halving: {-1, 1} binds at once, {5, -3, 2} fails, then {5} fails and {-3, 2} binds.
  EXPECT_EQ(calls_, 4);
}

TEST_F(PieceBindingTest, NothingComesBackWhenEveryPieceFailsOrTheRunIsCancelled) {
  CancelAfter never(1 << 30);
  const PieceBinding none = bindInGroups(
      mesh_, pieceOf_, pieces_, [](const Mesh&) { return Weights{}; }, never);
  EXPECT_EQ(none.unboundPieces, pieces_);
  EXPECT_EQ(none.weights.numVertices(), 0u);

  CancelAfter soon(1);
  const PieceBinding cancelled = bindInGroups(mesh_, pieceOf_, pieces_, fake(), soon);
  EXPECT_EQ(cancelled.weights.numVertices(), 0u);
}

}  // namespace
}  // namespace TessikSDK::Pipeline

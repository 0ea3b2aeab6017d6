// Cost of the collision octree on a finely tessellated torus: building it at the depth limits callers
// use, and walking it with point and segment visitors shaped like the library's own (depth-first
// pre-order, bounds test first, elements only on leaves, children in index order).
//
// Query benchmarks count one item per query, so items_per_second is queries per second. Their trees
// are built once per depth outside the timed loop; only one tree is kept alive at a time because the
// deep ones take gigabytes.

#include <algorithm>
#include <chrono>
#include <cmath>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <random>
#include <string>
#include <vector>

#include <benchmark/benchmark.h>
#include <glm/geometric.hpp>
#include <glm/vec3.hpp>

#include "common/run_benchmarks.h"
#include "geombind/collision/intersection.h"
#include "geombind/collision/octree.h"
#include "geombind/collision/primitives.h"

namespace {

using TessikSDK::GeomBind::Collision::AABB;
using TessikSDK::GeomBind::Collision::contains;
using TessikSDK::GeomBind::Collision::intersects;
using TessikSDK::GeomBind::Collision::IOctreeConstVisitor;
using TessikSDK::GeomBind::Collision::IOctreeElement;
using TessikSDK::GeomBind::Collision::Octant;
using TessikSDK::GeomBind::Collision::Octree;
using TessikSDK::GeomBind::Collision::OctreeElement;
using TessikSDK::GeomBind::Collision::Segment;
using TessikSDK::GeomBind::Collision::Triangle;

using TriangleElement = OctreeElement<Triangle>;

constexpr std::uint32_t kSeed = 20240611;
// 100k triangles (250 x 200 quads, two each): the size of a dense production mesh.
constexpr int kRingSteps = 250;
constexpr int kTubeSteps = 200;
constexpr double kRingRadius = 1.0;
constexpr double kTubeRadius = 0.4;
constexpr std::size_t kPoolSize = std::size_t{1} << 20;
constexpr std::size_t kLongPoolSize = std::size_t{1} << 16;

// Hand-rolled so the scene is the same under every standard library, which std:: distributions are not.
double Unit(std::mt19937_64& rng) { return static_cast<double>(rng() >> 11) * 0x1.0p-53; }

double Between(std::mt19937_64& rng, double lo, double hi) { return lo + (hi - lo) * Unit(rng); }

glm::dvec3 InBox(std::mt19937_64& rng, const AABB& box) {
  return {Between(rng, box.lower.x, box.upper.x), Between(rng, box.lower.y, box.upper.y),
          Between(rng, box.lower.z, box.upper.z)};
}

glm::dvec3 RandomDirection(std::mt19937_64& rng) {
  for (;;) {
    const glm::dvec3 v(Between(rng, -1.0, 1.0), Between(rng, -1.0, 1.0), Between(rng, -1.0, 1.0));
    const double len = glm::length(v);
    if (len > 0.1 && len <= 1.0) return v / len;
  }
}

glm::dvec3 OnTriangle(std::mt19937_64& rng, const Triangle& t) {
  double u = Unit(rng);
  double v = Unit(rng);
  if (u + v > 1.0) {
    u = 1.0 - u;
    v = 1.0 - v;
  }
  return t.a + u * (t.b - t.a) + v * (t.c - t.a);
}

struct Mesh {
  std::vector<Triangle> triangles;
  AABB box;
};

// The radial jitter keeps vertices off the regular lattice, which would otherwise line many of them up
// exactly on octant faces and flatter or punish the closed tests unrealistically.
Mesh MakeTorus() {
  std::mt19937_64 rng(kSeed);
  std::vector<glm::dvec3> vertices;
  vertices.reserve(static_cast<std::size_t>(kRingSteps) * kTubeSteps);
  const double twoPi = 2.0 * std::acos(-1.0);
  for (int i = 0; i < kRingSteps; ++i) {
    const double u = twoPi * i / kRingSteps;
    for (int j = 0; j < kTubeSteps; ++j) {
      const double v = twoPi * j / kTubeSteps;
      const double r = kTubeRadius * (1.0 + 0.02 * Between(rng, -1.0, 1.0));
      vertices.emplace_back((kRingRadius + r * std::cos(v)) * std::cos(u),
                            (kRingRadius + r * std::cos(v)) * std::sin(u), r * std::sin(v));
    }
  }
  auto at = [&](int i, int j) -> const glm::dvec3& {
    return vertices[static_cast<std::size_t>(i % kRingSteps) * kTubeSteps + j % kTubeSteps];
  };
  Mesh mesh;
  mesh.triangles.reserve(2 * vertices.size());
  for (int i = 0; i < kRingSteps; ++i) {
    for (int j = 0; j < kTubeSteps; ++j) {
      mesh.triangles.emplace_back(at(i, j), at(i + 1, j), at(i + 1, j + 1));
      mesh.triangles.emplace_back(at(i, j), at(i + 1, j + 1), at(i, j + 1));
    }
  }
  for (const glm::dvec3& p : vertices) mesh.box.extend(p);
  return mesh;
}

const Mesh& TheMesh() {
  static const Mesh mesh = MakeTorus();
  return mesh;
}

std::unique_ptr<Octree> BuildTree(const Mesh& mesh, std::uint32_t depthLimit) {
  auto tree = std::make_unique<Octree>();
  tree->reset(mesh.box);
  for (const Triangle& t : mesh.triangles) tree->insert(std::make_unique<TriangleElement>(t));
  tree->build(0, depthLimit);
  return tree;
}

struct TreeStats {
  double octants = 0;
  double leavesWithElements = 0;
  double listings = 0;
  double maxLeafListings = 0;
  double bytes = 0;  // what the containers hold, without allocator overhead
};

class StatsVisitor : public IOctreeConstVisitor {
 public:
  void visit(const Octant& octant) override {
    stats.octants += 1;
    stats.bytes += sizeof(Octant) + octant.children().capacity() * sizeof(octant.children()[0]) +
                   octant.elements().capacity() * sizeof(IOctreeElement*);
    if (octant.children().empty()) {
      const double n = static_cast<double>(octant.elements().size());
      if (n > 0) stats.leavesWithElements += 1;
      stats.listings += n;
      stats.maxLeafListings = std::max(stats.maxLeafListings, n);
      return;
    }
    for (const auto& child : octant.children()) child->accept(*this);
  }

  TreeStats stats;
};

TreeStats Measure(const Octree& tree) {
  StatsVisitor visitor;
  tree.accept(visitor);
  visitor.stats.bytes += static_cast<double>(tree.allElements().capacity() * sizeof(tree.allElements()[0]) +
                                             tree.allElements().size() * sizeof(TriangleElement));
  return visitor.stats;
}

void ReportStats(benchmark::State& state, const TreeStats& s) {
  state.counters["octants"] = s.octants;
  state.counters["leaves_w_elems"] = s.leavesWithElements;
  state.counters["listings"] = s.listings;
  state.counters["max_leaf"] = s.maxLeafListings;
  state.counters["mem_MiB"] = s.bytes / (1024.0 * 1024.0);
}

// Counts what the leaves holding the point list; `found`, when set, also receives those elements.
class PointVisitor : public IOctreeConstVisitor {
 public:
  void visit(const Octant& octant) override {
    if (!contains(octant.bounds, point)) return;
    if (octant.children().empty()) {
      listings += octant.elements().size();
      if (found != nullptr) found->insert(found->end(), octant.elements().begin(), octant.elements().end());
      return;
    }
    for (const auto& child : octant.children()) child->accept(*this);
  }

  glm::dvec3 point{0.0};
  std::size_t listings = 0;
  std::vector<const IOctreeElement*>* found = nullptr;
};

// Gathers the elements of every leaf the segment touches. A triangle met in several leaves is tested
// once: the candidates are deduplicated after the walk, which stays cheap however many leaves a long
// segment crosses.
class SegmentVisitor : public IOctreeConstVisitor {
 public:
  void visit(const Octant& octant) override {
    if (!intersects(octant.bounds, segment)) return;
    if (octant.children().empty()) {
      candidates.insert(candidates.end(), octant.elements().begin(), octant.elements().end());
      return;
    }
    for (const auto& child : octant.children()) child->accept(*this);
  }

  // Returns how many distinct listed triangles the segment's line crosses.
  std::size_t query(const Octree& tree, const Segment& s) {
    segment = s;
    candidates.clear();
    tree.accept(*this);
    std::sort(candidates.begin(), candidates.end());
    candidates.erase(std::unique(candidates.begin(), candidates.end()), candidates.end());
    distinct += candidates.size();
    std::size_t hits = 0;
    for (const IOctreeElement* e : candidates) {
      if (intersects(segment, *e->as<Triangle>())) ++hits;
    }
    return hits;
  }

  Segment segment;
  std::vector<const IOctreeElement*> candidates;
  std::size_t distinct = 0;
};

enum QueryKind { kPointsInBox = 0, kPointsOnSurface = 1, kShortSegments = 2, kLongSegments = 3 };

const char* KindName(QueryKind kind) {
  switch (kind) {
    case kPointsInBox:
      return "points_in_box";
    case kPointsOnSurface:
      return "points_on_surface";
    case kShortSegments:
      return "short_segments";
    case kLongSegments:
      return "long_segments";
  }
  return "?";
}

struct QueryPools {
  std::vector<glm::dvec3> inBox;
  std::vector<glm::dvec3> onSurface;
  std::vector<Segment> shortSegments;  // 5% of the box diagonal, anywhere in the box
  std::vector<Segment> longSegments;   // both ends anywhere in the box
};

QueryPools MakePools(const Mesh& mesh) {
  std::mt19937_64 rng(kSeed + 1);
  QueryPools pools;
  const double shortLength = 0.05 * glm::length(mesh.box.upper - mesh.box.lower);
  pools.inBox.reserve(kPoolSize);
  pools.onSurface.reserve(kPoolSize);
  pools.shortSegments.reserve(kPoolSize);
  pools.longSegments.reserve(kLongPoolSize);
  for (std::size_t i = 0; i < kPoolSize; ++i) {
    pools.inBox.push_back(InBox(rng, mesh.box));
    const Triangle& t = mesh.triangles[rng() % mesh.triangles.size()];
    pools.onSurface.push_back(OnTriangle(rng, t));
    const glm::dvec3 mid = InBox(rng, mesh.box);
    const glm::dvec3 half = 0.5 * shortLength * RandomDirection(rng);
    pools.shortSegments.emplace_back(mid - half, mid + half);
  }
  for (std::size_t i = 0; i < kLongPoolSize; ++i) {
    const glm::dvec3 a = InBox(rng, mesh.box);
    pools.longSegments.emplace_back(a, InBox(rng, mesh.box));
  }
  return pools;
}

const QueryPools& ThePools() {
  static const QueryPools pools = MakePools(TheMesh());
  return pools;
}

// A few triangles must be found by both visitors where they obviously are: from one of their vertices,
// and by a short segment through their centroid along their normal.
std::string Verify(const Octree& tree, const Mesh& mesh) {
  std::mt19937_64 rng(kSeed + 2);
  std::vector<const IOctreeElement*> found;
  for (int trial = 0; trial < 64; ++trial) {
    const std::size_t index = rng() % mesh.triangles.size();
    const Triangle& t = mesh.triangles[index];
    const IOctreeElement* element = tree.allElements()[index].get();

    PointVisitor pv;
    found.clear();
    pv.found = &found;
    pv.point = t.b;
    tree.accept(pv);
    if (std::find(found.begin(), found.end(), element) == found.end()) {
      return "point query at a vertex missed its triangle " + std::to_string(index);
    }

    const glm::dvec3 centroid = (t.a + t.b + t.c) / 3.0;
    const glm::dvec3 n = glm::normalize(glm::cross(t.b - t.a, t.c - t.a));
    SegmentVisitor sv;
    const Segment s(centroid - 1e-3 * n, centroid + 1e-3 * n);
    if (sv.query(tree, s) == 0 ||
        std::find(sv.candidates.begin(), sv.candidates.end(), element) == sv.candidates.end()) {
      return "segment through a centroid missed its triangle " + std::to_string(index);
    }
  }
  return {};
}

struct CachedTree {
  std::uint32_t depth = 0;
  std::unique_ptr<Octree> tree;
  TreeStats stats;
  std::string error;
};

// Query benchmarks are registered grouped by depth, so each tree is built once; the previous one is
// freed first to keep the peak at a single tree.
const CachedTree& TreeForDepth(std::uint32_t depth) {
  static CachedTree cache;
  if (!cache.tree || cache.depth != depth) {
    cache.tree.reset();
    cache.depth = depth;
    cache.tree = BuildTree(TheMesh(), depth);
    cache.stats = Measure(*cache.tree);
    cache.error = Verify(*cache.tree, TheMesh());
  }
  return cache;
}

void BM_OctreeBuild(benchmark::State& state) {
  const Mesh& mesh = TheMesh();
  const auto depth = static_cast<std::uint32_t>(state.range(0));
  std::unique_ptr<Octree> tree;
  for (auto _ : state) {
    state.PauseTiming();
    tree.reset();  // teardown is reported apart below
    state.ResumeTiming();
    tree = BuildTree(mesh, depth);
    benchmark::DoNotOptimize(tree->children().data());
  }
  const std::string error = Verify(*tree, mesh);
  if (!error.empty()) {
    state.SkipWithError(error.c_str());
    return;
  }
  ReportStats(state, Measure(*tree));
  const auto start = std::chrono::steady_clock::now();
  tree.reset();
  state.counters["teardown_ms"] =
      std::chrono::duration<double, std::milli>(std::chrono::steady_clock::now() - start).count();
  state.counters["triangles"] = static_cast<double>(mesh.triangles.size());
}

void BM_OctreeQuery(benchmark::State& state) {
  const auto depth = static_cast<std::uint32_t>(state.range(0));
  const auto kind = static_cast<QueryKind>(state.range(1));
  const auto batch = static_cast<std::size_t>(state.range(2));
  const QueryPools& pools = ThePools();
  const CachedTree& cached = TreeForDepth(depth);
  if (!cached.error.empty()) {
    state.SkipWithError(cached.error.c_str());
    return;
  }
  const Octree& tree = *cached.tree;
  state.SetLabel(KindName(kind));

  PointVisitor pv;
  SegmentVisitor sv;
  std::size_t cursor = 0;
  std::size_t results = 0;
  for (auto _ : state) {
    switch (kind) {
      case kPointsInBox:
      case kPointsOnSurface: {
        const auto& pool = kind == kPointsInBox ? pools.inBox : pools.onSurface;
        for (std::size_t q = 0; q < batch; ++q) {
          pv.point = pool[cursor];
          cursor = (cursor + 1) % pool.size();
          tree.accept(pv);
        }
        break;
      }
      case kShortSegments:
      case kLongSegments: {
        const auto& pool = kind == kShortSegments ? pools.shortSegments : pools.longSegments;
        for (std::size_t q = 0; q < batch; ++q) {
          results += sv.query(tree, pool[cursor]);
          cursor = (cursor + 1) % pool.size();
        }
        break;
      }
    }
  }
  const double queries = static_cast<double>(state.iterations()) * static_cast<double>(batch);
  state.SetItemsProcessed(static_cast<std::int64_t>(queries));
  // Per-query work, to read the rates against: leaf listings met (points), distinct candidate
  // triangles and line hits (segments).
  if (kind == kPointsInBox || kind == kPointsOnSurface) {
    state.counters["listings_per_q"] = static_cast<double>(pv.listings) / queries;
  } else {
    state.counters["candidates_per_q"] = static_cast<double>(sv.distinct) / queries;
    state.counters["hits_per_q"] = static_cast<double>(results) / queries;
  }
  state.counters["octants"] = cached.stats.octants;
}

constexpr int kDepths[] = {6, 8, 10};

void RegisterAll() {
  for (int depth : kDepths) {
    benchmark::RegisterBenchmark("BM_OctreeBuild", BM_OctreeBuild)
        ->Arg(depth)
        ->ArgName("depth")
        ->Unit(benchmark::kMillisecond)
        ->UseRealTime();
  }
  for (int depth : kDepths) {
    for (int kind : {kPointsInBox, kPointsOnSurface, kShortSegments, kLongSegments}) {
      // 16 batches of 64Ki queries make 1Mi queries per kind; long segments cross so many leaves
      // that 1Mi of them would dominate the run, so they get a sixteenth of that.
      const bool isLong = kind == kLongSegments;
      benchmark::RegisterBenchmark("BM_OctreeQuery", BM_OctreeQuery)
          ->Args({depth, kind, isLong ? 4096 : 65536})
          ->ArgNames({"depth", "kind", "batch"})
          ->Iterations(16)
          ->Unit(benchmark::kMillisecond)
          ->UseRealTime();
    }
  }
}

}  // namespace

int main(int argc, char** argv) {
  RegisterAll();
  return tessik::bench::runBenchmarks(argc, argv);
}

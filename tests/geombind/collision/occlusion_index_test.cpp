#include "geombind/collision/occlusion_index.h"

#include <cmath>
#include <cstdint>
#include <functional>
#include <ostream>
#include <random>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "collision/octree_sight.h"
#include "meshes/character.h"
#include "meshes/mesh_builders.h"

namespace {

namespace col = TessikSDK::GeomBind::Collision;
using col::AABB;
using col::Segment;
using col::Triangle;
using glm::dvec3;

struct Soup {
  std::vector<Triangle> triangles;
  AABB bounds;
  void add(const Triangle& t) {
    triangles.push_back(t);
    for (const dvec3& p : {t.a, t.b, t.c}) bounds.extend(p);
  }
};

Soup fromMesh(const tessik::meshes::TriMesh& mesh) {
  Soup soup;
  auto at = [&](std::uint32_t v) {
    return dvec3(mesh.positions[v][0], mesh.positions[v][1], mesh.positions[v][2]);
  };
  for (const auto& t : mesh.triangles) soup.add(Triangle(at(t[0]), at(t[1]), at(t[2])));
  return soup;
}

double uniform(std::mt19937& rng, double lo, double hi) {
  return lo + (hi - lo) * static_cast<double>(rng()) / 4294967296.0;
}

dvec3 inBox(std::mt19937& rng, const AABB& box, double slack = 0.0) {
  const dvec3 pad = (box.upper - box.lower) * slack;
  return {uniform(rng, box.lower.x - pad.x, box.upper.x + pad.x),
          uniform(rng, box.lower.y - pad.y, box.upper.y + pad.y),
          uniform(rng, box.lower.z - pad.z, box.upper.z + pad.z)};
}

// Small triangles scattered over [-1, 1]^3 and slivers running corner to corner across it; the box is
// exactly dyadic, so cell faces fall on representable values that the queries below can hit.
Soup scatterAndSlivers(unsigned seed) {
  std::mt19937 rng(seed);
  Soup soup;
  soup.add(Triangle(dvec3(-1.0), dvec3(-1.0, -1.0, -0.999), dvec3(-0.999, -1.0, -1.0)));
  soup.add(Triangle(dvec3(1.0), dvec3(1.0, 1.0, 0.999), dvec3(0.999, 1.0, 1.0)));
  const AABB unit(dvec3(-1.0), dvec3(1.0));
  for (int i = 0; i < 300; ++i) {
    const dvec3 c = inBox(rng, unit);
    const double s = uniform(rng, 0.005, 0.08);
    soup.add(Triangle(c, c + dvec3(s, uniform(rng, -s, s), 0.0), c + dvec3(0.0, uniform(rng, -s, s), s)));
  }
  for (int i = 0; i < 60; ++i) {
    const dvec3 a = inBox(rng, unit) * 0.95, b = inBox(rng, unit) * 0.95;
    const dvec3 thin(uniform(rng, -1e-3, 1e-3), uniform(rng, -1e-3, 1e-3), uniform(rng, -1e-3, 1e-3));
    soup.add(Triangle(a, b, b + thin));
  }
  return soup;
}

// A flat sheet: the octree pads its flat axis, and every segment across it meets the plane.
Soup flatSheet() {
  tessik::meshes::TriMesh sheet;
  const int n = 12;
  for (int y = 0; y <= n; ++y)
    for (int x = 0; x <= n; ++x) sheet.add(static_cast<float>(x) / n, static_cast<float>(y) / n * 0.5f, 0.0f);
  for (int y = 0; y < n; ++y)
    for (int x = 0; x < n; ++x) {
      const auto i = static_cast<std::uint32_t>(y * (n + 1) + x);
      tessik::meshes::quad(sheet, i, i + 1, i + n + 2, i + n + 1);
    }
  return fromMesh(sheet);
}

// Queries of every kind the binding makes and some it never does: free segments, segments from
// vertices (where the line passes exactly through a triangle corner), segments whose end points sit on
// the faces of leaf cells, and axis-parallel segments lying in a cell face.
std::vector<Segment> queries(const Soup& soup, std::uint32_t depth, unsigned seed) {
  std::mt19937 rng(seed);
  AABB box = soup.bounds;
  box.inflateFlatAxes();
  const dvec3 cell = (box.upper - box.lower) / std::ldexp(1.0, static_cast<int>(depth));
  auto onGrid = [&](dvec3 p) {
    for (int k = 0; k < 3; ++k) p[k] = box.lower[k] + std::round((p[k] - box.lower[k]) / cell[k]) * cell[k];
    return p;
  };
  std::vector<Segment> out;
  for (int i = 0; i < 600; ++i) out.emplace_back(inBox(rng, box, 0.1), inBox(rng, box, 0.1));
  for (int i = 0; i < 600; ++i) {
    const Triangle& t = soup.triangles[rng() % soup.triangles.size()];
    const dvec3 corner = (i % 3 == 0) ? t.a : (i % 3 == 1 ? t.b : t.c);
    out.emplace_back(corner, corner + (inBox(rng, box) - corner) * uniform(rng, 0.05, 1.0));
  }
  for (int i = 0; i < 600; ++i) out.emplace_back(onGrid(inBox(rng, box)), onGrid(inBox(rng, box)));
  for (int i = 0; i < 300; ++i) {
    const dvec3 a = onGrid(inBox(rng, box));
    dvec3 b = a;
    const int k = static_cast<int>(rng() % 3);
    b[k] =
        box.lower[k] + std::round(uniform(rng, 0.0, 1.0) * (box.upper[k] - box.lower[k]) / cell[k]) * cell[k];
    out.emplace_back(a, b);
  }
  return out;
}

struct Case {
  std::string name;
  std::function<Soup()> soup;
  std::uint32_t depth;
};

void PrintTo(const Case& c, std::ostream* os) { *os << c.name << " at depth " << c.depth; }

class OcclusionIndexMatchesOctree : public ::testing::TestWithParam<Case> {};

TEST_P(OcclusionIndexMatchesOctree, OnEveryQuery) {
  const Soup soup = GetParam().soup();
  const std::uint32_t depth = GetParam().depth;
  const col::Testing::OctreeSight reference(soup.bounds, soup.triangles, depth);
  const col::OcclusionIndex index(soup.bounds, soup.triangles, depth);
  std::size_t blocked = 0, mismatches = 0;
  const std::vector<Segment> segments = queries(soup, depth, 7u + depth);
  for (const Segment& s : segments) {
    const bool expected = reference.blocked(s);
    blocked += expected;
    if (index.blocked(s) != expected && ++mismatches <= 5) {
      ADD_FAILURE() << "segment (" << s.a.x << ", " << s.a.y << ", " << s.a.z << ") - (" << s.b.x << ", "
                    << s.b.y << ", " << s.b.z << "): octree says " << expected;
    }
  }
  EXPECT_EQ(mismatches, 0u);
  // Both answers must be common, or agreement would prove little.
  EXPECT_GT(blocked, segments.size() / 20);
  EXPECT_LT(blocked, segments.size() * 9 / 10);
}

INSTANTIATE_TEST_SUITE_P(
    Meshes,
    OcclusionIndexMatchesOctree,
    ::testing::Values(Case{"torus",
                           [] {
                             return fromMesh(tessik::meshes::torus({0.1f, 0.2f, 0.3f}, 1.0f, 0.4f, 24, 12));
                           },
                           6},
                      Case{"character", [] { return fromMesh(tessik::meshes::character(0.02).mesh); }, 7},
                      Case{"flat_sheet", flatSheet, 8},
                      Case{"scatter_and_slivers", [] { return scatterAndSlivers(11); }, 10},
                      Case{"slivers_shallow", [] { return scatterAndSlivers(12); }, 3}),
    [](const ::testing::TestParamInfo<Case>& info) { return info.param.name; });

TEST(OcclusionIndex, EmptyBlocksNothing) {
  const col::OcclusionIndex empty;
  EXPECT_FALSE(empty.blocked(Segment(dvec3(0.0), dvec3(1.0))));
  const col::OcclusionIndex none(AABB(dvec3(0.0), dvec3(1.0)), {}, 10);
  EXPECT_FALSE(none.blocked(Segment(dvec3(0.0), dvec3(1.0))));
}

}  // namespace

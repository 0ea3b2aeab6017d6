#pragma once

#include <array>
#include <cmath>
#include <cstdint>
#include <vector>

// Closed, outward-wound (counter-clockwise seen from outside) triangle meshes built in code, for tests,
// benchmarks and tools.
namespace tessik::meshes {

using Vec3 = std::array<float, 3>;

struct TriMesh {
  std::vector<Vec3> positions;
  std::vector<std::array<std::uint32_t, 3>> triangles;

  std::uint32_t add(float x, float y, float z) {
    positions.push_back({x, y, z});
    return static_cast<std::uint32_t>(positions.size() - 1);
  }
  void append(const TriMesh& other) {
    const auto base = static_cast<std::uint32_t>(positions.size());
    positions.insert(positions.end(), other.positions.begin(), other.positions.end());
    for (auto t : other.triangles) triangles.push_back({t[0] + base, t[1] + base, t[2] + base});
  }
};

// A quad a-b-c-d, counter-clockwise seen from where it faces.
inline void quad(TriMesh& m, std::uint32_t a, std::uint32_t b, std::uint32_t c, std::uint32_t d) {
  m.triangles.push_back({a, b, c});
  m.triangles.push_back({a, c, d});
}

inline TriMesh box(const Vec3& lo, const Vec3& hi) {
  TriMesh m;
  for (int i = 0; i < 8; ++i)
    m.add((i & 1) ? hi[0] : lo[0], (i & 2) ? hi[1] : lo[1], (i & 4) ? hi[2] : lo[2]);
  quad(m, 0, 2, 3, 1);  // -z
  quad(m, 4, 5, 7, 6);  // +z
  quad(m, 0, 1, 5, 4);  // -y
  quad(m, 2, 6, 7, 3);  // +y
  quad(m, 0, 4, 6, 2);  // -x
  quad(m, 1, 3, 7, 5);  // +x
  return m;
}

// Latitude/longitude sphere: `rings` bands from pole to pole, `segments` around.
inline TriMesh sphere(const Vec3& c, float r, int rings, int segments) {
  TriMesh m;
  const double pi = 3.14159265358979323846;
  const std::uint32_t south = m.add(c[0], c[1], c[2] - r);
  for (int i = 1; i < rings; ++i) {
    const double theta = pi * i / rings - pi / 2;
    for (int j = 0; j < segments; ++j) {
      const double phi = 2 * pi * j / segments;
      m.add(c[0] + static_cast<float>(r * std::cos(theta) * std::cos(phi)),
            c[1] + static_cast<float>(r * std::cos(theta) * std::sin(phi)),
            c[2] + static_cast<float>(r * std::sin(theta)));
    }
  }
  const std::uint32_t north = m.add(c[0], c[1], c[2] + r);
  auto at = [&](int ring, int j) {
    return static_cast<std::uint32_t>(1 + (ring - 1) * segments + (j % segments));
  };
  for (int j = 0; j < segments; ++j) {
    m.triangles.push_back({south, at(1, j + 1), at(1, j)});
    m.triangles.push_back({north, at(rings - 1, j), at(rings - 1, j + 1)});
    for (int i = 1; i + 1 < rings; ++i) quad(m, at(i, j), at(i, j + 1), at(i + 1, j + 1), at(i + 1, j));
  }
  return m;
}

// Torus around the z axis (major radius R, tube radius r); `swapYZ` turns it to lie around the y axis.
inline TriMesh torus(const Vec3& c, float R, float r, int segments, int sides, bool swapYZ = false) {
  TriMesh m;
  const double pi = 3.14159265358979323846;
  for (int i = 0; i < segments; ++i) {
    const double u = 2 * pi * i / segments;
    for (int j = 0; j < sides; ++j) {
      const double v = 2 * pi * j / sides;
      const double x = (R + r * std::cos(v)) * std::cos(u), y = (R + r * std::cos(v)) * std::sin(u),
                   z = r * std::sin(v);
      if (swapYZ) {
        m.add(c[0] + static_cast<float>(x), c[1] - static_cast<float>(z), c[2] + static_cast<float>(y));
      } else {
        m.add(c[0] + static_cast<float>(x), c[1] + static_cast<float>(y), c[2] + static_cast<float>(z));
      }
    }
  }
  auto at = [&](int i, int j) { return static_cast<std::uint32_t>((i % segments) * sides + (j % sides)); };
  for (int i = 0; i < segments; ++i)
    for (int j = 0; j < sides; ++j) quad(m, at(i, j), at(i + 1, j), at(i + 1, j + 1), at(i, j + 1));
  return m;
}

// Capped cylinder along +x from x0 to x1 around the line (y, z) = (cy, cz): `rings` sections along the
// axis, `segments` around it.
inline TriMesh cylinderX(float x0, float x1, float cy, float cz, float r, int rings, int segments) {
  TriMesh m;
  const double pi = 3.14159265358979323846;
  for (int i = 0; i <= rings; ++i) {
    const float x = x0 + (x1 - x0) * static_cast<float>(i) / static_cast<float>(rings);
    for (int j = 0; j < segments; ++j) {
      const double a = 2 * pi * j / segments;
      m.add(x, cy + static_cast<float>(r * std::cos(a)), cz + static_cast<float>(r * std::sin(a)));
    }
  }
  auto at = [&](int i, int j) { return static_cast<std::uint32_t>(i * segments + (j % segments)); };
  for (int i = 0; i < rings; ++i)
    for (int j = 0; j < segments; ++j) quad(m, at(i, j), at(i, j + 1), at(i + 1, j + 1), at(i + 1, j));
  const std::uint32_t start = m.add(x0, cy, cz), end = m.add(x1, cy, cz);
  for (int j = 0; j < segments; ++j) {
    m.triangles.push_back({start, at(0, j + 1), at(0, j)});
    m.triangles.push_back({end, at(rings, j), at(rings, j + 1)});
  }
  return m;
}

// The L-shaped prism: the polygon (0,0) (2,0) (2,1) (1,1) (1,2) (0,2), scaled by `s`, from z0 to z1.
inline TriMesh lShape(const Vec3& origin, float s, float z0, float z1) {
  const float poly[6][2] = {{0, 0}, {2, 0}, {2, 1}, {1, 1}, {1, 2}, {0, 2}};
  TriMesh m;
  for (float z : {z0, z1})
    for (const auto& p : poly) m.add(origin[0] + s * p[0], origin[1] + s * p[1], origin[2] + z);
  // Caps fan out from the reflex corner (index 3), which sees the whole polygon.
  const std::uint32_t fan[4][2] = {{4, 5}, {5, 0}, {0, 1}, {1, 2}};
  for (const auto& f : fan) {
    m.triangles.push_back({3, f[1], f[0]});          // bottom faces -z
    m.triangles.push_back({9, 6 + f[0], 6 + f[1]});  // top faces +z
  }
  for (std::uint32_t i = 0; i < 6; ++i) quad(m, i, (i + 1) % 6, 6 + (i + 1) % 6, 6 + i);
  return m;
}

}  // namespace tessik::meshes

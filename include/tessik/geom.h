#pragma once

#include <cstdint>

#include <tessik/export.h>

/// Host geometry layer: the single-precision point and affine matrix of the skin engine.
///
/// Points are row vectors. `p * M` transforms a point with translation; `A * B` is the transform that
/// applies A first, then B. Every function here is pure and may be called from several threads.
namespace TessikSDK::Geom {

struct TESSIK_API Point3 {
  float x = 0.0f;
  float y = 0.0f;
  float z = 0.0f;

  Point3() = default;
  Point3(float px, float py, float pz) : x(px), y(py), z(pz) {}
  /// Reads three consecutive floats (x, y, z).
  explicit Point3(const float* xyz) : x(xyz[0]), y(xyz[1]), z(xyz[2]) {}

  float& operator[](int i) { return i == 0 ? x : (i == 1 ? y : z); }
  float operator[](int i) const { return i == 0 ? x : (i == 1 ? y : z); }

  Point3 operator+(const Point3& o) const { return {x + o.x, y + o.y, z + o.z}; }
  Point3 operator-(const Point3& o) const { return {x - o.x, y - o.y, z - o.z}; }
  Point3 operator*(float s) const { return {x * s, y * s, z * s}; }
  Point3& operator+=(const Point3& o) {
    x += o.x;
    y += o.y;
    z += o.z;
    return *this;
  }
  bool operator==(const Point3& o) const { return x == o.x && y == o.y && z == o.z; }
  bool operator!=(const Point3& o) const { return !(*this == o); }

  float Length() const;
  /// This vector scaled to unit length; the zero vector stays zero (never NaN).
  Point3 Normalize() const;
  /// The cross product, this vector first.
  Point3 CrossProd(const Point3& o) const {
    return {y * o.z - z * o.y, z * o.x - x * o.z, x * o.y - y * o.x};
  }
};

inline float DotProd(const Point3& a, const Point3& b) { return a.x * b.x + a.y * b.y + a.z * b.z; }

/// An affine transform as four rows: X axis, Y axis, Z axis, translation. The flags word belongs to the
/// geometry layer; the engine copies it with the matrix and never reads it.
class TESSIK_API Matrix3 {
 public:
  /// The identity.
  Matrix3();
  Matrix3(const Point3& xAxis, const Point3& yAxis, const Point3& zAxis, const Point3& translation);
  /// Twelve floats, the four rows in order.
  static Matrix3 FromFloats(const float* twelve);

  const Point3& GetRow(int i) const { return rows[i]; }
  void SetRow(int i, const Point3& row) { rows[i] = row; }
  std::uint32_t GetFlags() const { return flags; }

  /// Composition: the result applies this matrix first, then `b`.
  Matrix3 operator*(const Matrix3& b) const;

 private:
  Point3 rows[4];
  std::uint32_t flags = 0;
};

/// The point transformed by `m`, translation included.
inline Point3 operator*(const Point3& p, const Matrix3& m) {
  const Point3& r0 = m.GetRow(0);
  const Point3& r1 = m.GetRow(1);
  const Point3& r2 = m.GetRow(2);
  const Point3& t = m.GetRow(3);
  return {p.x * r0.x + p.y * r1.x + p.z * r2.x + t.x, p.x * r0.y + p.y * r1.y + p.z * r2.y + t.y,
          p.x * r0.z + p.y * r1.z + p.z * r2.z + t.z};
}

/// The direction `v` transformed by `m` without its translation.
inline Point3 VectorTransform(const Matrix3& m, const Point3& v) {
  const Point3& r0 = m.GetRow(0);
  const Point3& r1 = m.GetRow(1);
  const Point3& r2 = m.GetRow(2);
  return {v.x * r0.x + v.y * r1.x + v.z * r2.x, v.x * r0.y + v.y * r1.y + v.z * r2.y,
          v.x * r0.z + v.y * r1.z + v.z * r2.z};
}

/// The engine's form of an affine 4x4 transform written, as hosts and file formats write it, as sixteen
/// doubles row by row for column vectors (p' = M p, translation in elements 3, 7 and 11): column c of
/// the 4x4 becomes row c here. The bottom row is not read.
TESSIK_API Matrix3 Matrix3FromRowMajor4x4(const double* m);

/// The inverse affine transform, computed in double precision. A singular matrix (determinant 0 or
/// not finite) has no inverse; the identity is returned so callers never see NaN from it.
TESSIK_API Matrix3 Inverse(const Matrix3& m);

/// The rotation by `angle` radians about the unit vector `axis`, zero translation. The sense is
/// right-handed for row vectors: with a = (b x c) / |b x c| and angle the angle from b to c, `b * R`
/// points along c. A zero axis turns nothing and gives the identity.
TESSIK_API Matrix3 RotAngleAxisMatrix(const Point3& axis, float angle);

}  // namespace TessikSDK::Geom

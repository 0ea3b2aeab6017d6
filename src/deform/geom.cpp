#include "tessik/geom.h"

#include <cmath>

namespace TessikSDK::Geom {

float Point3::Length() const { return std::sqrt(x * x + y * y + z * z); }

Point3 Point3::Normalize() const {
  const float length = Length();
  if (length == 0.0f) return *this;
  return {x / length, y / length, z / length};
}

Matrix3::Matrix3() : rows{{1, 0, 0}, {0, 1, 0}, {0, 0, 1}, {0, 0, 0}} {}

Matrix3::Matrix3(const Point3& xAxis, const Point3& yAxis, const Point3& zAxis, const Point3& translation)
    : rows{xAxis, yAxis, zAxis, translation} {}

Matrix3 Matrix3::FromFloats(const float* twelve) {
  return Matrix3(Point3(twelve), Point3(twelve + 3), Point3(twelve + 6), Point3(twelve + 9));
}

Matrix3 Matrix3::operator*(const Matrix3& b) const {
  // Row vectors: the rows of this matrix are points/directions pushed through b.
  return Matrix3(VectorTransform(b, rows[0]), VectorTransform(b, rows[1]), VectorTransform(b, rows[2]),
                 rows[3] * b);
}

Matrix3 Matrix3FromRowMajor4x4(const double* m) {
  auto column = [&](int c) {
    return Point3(static_cast<float>(m[c]), static_cast<float>(m[4 + c]), static_cast<float>(m[8 + c]));
  };
  return Matrix3(column(0), column(1), column(2), column(3));
}

Matrix3 Inverse(const Matrix3& m) {
  double a[3][3];
  for (int r = 0; r < 3; ++r)
    for (int c = 0; c < 3; ++c) a[r][c] = m.GetRow(r)[c];
  const double c00 = a[1][1] * a[2][2] - a[1][2] * a[2][1];
  const double c01 = a[1][2] * a[2][0] - a[1][0] * a[2][2];
  const double c02 = a[1][0] * a[2][1] - a[1][1] * a[2][0];
  const double det = a[0][0] * c00 + a[0][1] * c01 + a[0][2] * c02;
  if (det == 0.0 || !std::isfinite(det)) return Matrix3();
  const double s = 1.0 / det;
  double inv[3][3] = {
      {c00 * s, (a[0][2] * a[2][1] - a[0][1] * a[2][2]) * s, (a[0][1] * a[1][2] - a[0][2] * a[1][1]) * s},
      {c01 * s, (a[0][0] * a[2][2] - a[0][2] * a[2][0]) * s, (a[0][2] * a[1][0] - a[0][0] * a[1][2]) * s},
      {c02 * s, (a[0][1] * a[2][0] - a[0][0] * a[2][1]) * s, (a[0][0] * a[1][1] - a[0][1] * a[1][0]) * s}};
  // The translation of the inverse is -t * inv(A) for row vectors.
  const Point3& t = m.GetRow(3);
  double it[3];
  for (int c = 0; c < 3; ++c) it[c] = -(t.x * inv[0][c] + t.y * inv[1][c] + t.z * inv[2][c]);
  auto row = [](const double* v) {
    return Point3(static_cast<float>(v[0]), static_cast<float>(v[1]), static_cast<float>(v[2]));
  };
  return Matrix3(row(inv[0]), row(inv[1]), row(inv[2]), row(it));
}

Matrix3 RotAngleAxisMatrix(const Point3& axis, float angle) {
  if (axis.x == 0.0f && axis.y == 0.0f && axis.z == 0.0f) return Matrix3();
  // Row i is the image of basis vector e_i under Rodrigues' rotation v cos + (a x v) sin + a (a.v)(1 - cos):
  // a right-handed turn of the row vector about `axis`.
  const float c = std::cos(angle);
  const float s = std::sin(angle);
  const float k = 1.0f - c;
  const float x = axis.x, y = axis.y, z = axis.z;
  return Matrix3(Point3(c + x * x * k, z * s + x * y * k, -y * s + x * z * k),
                 Point3(-z * s + y * x * k, c + y * y * k, x * s + y * z * k),
                 Point3(y * s + z * x * k, -x * s + z * y * k, c + z * z * k), Point3(0, 0, 0));
}

}  // namespace TessikSDK::Geom

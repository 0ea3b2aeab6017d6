#include "asset.h"

#include <algorithm>
#include <cmath>
#include <stdexcept>

namespace tessik::bind {

Mat4 identity() { return {1, 0, 0, 0, 0, 1, 0, 0, 0, 0, 1, 0, 0, 0, 0, 1}; }

Mat4 multiply(const Mat4& a, const Mat4& b) {
  Mat4 r{};
  for (int i = 0; i < 4; ++i)
    for (int j = 0; j < 4; ++j) {
      double s = 0.0;
      for (int k = 0; k < 4; ++k) s += a[4 * i + k] * b[4 * k + j];
      r[4 * i + j] = s;
    }
  return r;
}

Mat4 inverse(const Mat4& m) {
  // Gauss-Jordan with partial pivoting: bone matrices from files carry scale and shear often enough
  // that an affine-only shortcut would be wrong.
  std::array<double, 32> a{};
  for (int i = 0; i < 4; ++i)
    for (int j = 0; j < 4; ++j) {
      a[8 * i + j] = m[4 * i + j];
      a[8 * i + 4 + j] = i == j ? 1.0 : 0.0;
    }
  double scale = 0.0;
  for (double v : m) scale = std::max(scale, std::fabs(v));
  for (int c = 0; c < 4; ++c) {
    int pivot = c;
    for (int r = c + 1; r < 4; ++r)
      if (std::fabs(a[8 * r + c]) > std::fabs(a[8 * pivot + c])) pivot = r;
    if (!(std::fabs(a[8 * pivot + c]) > 1e-12 * std::max(scale, 1e-300)))
      throw std::runtime_error("a bone matrix cannot be inverted");
    if (pivot != c)
      for (int j = 0; j < 8; ++j) std::swap(a[8 * c + j], a[8 * pivot + j]);
    const double inv = 1.0 / a[8 * c + c];
    for (int j = 0; j < 8; ++j) a[8 * c + j] *= inv;
    for (int r = 0; r < 4; ++r) {
      if (r == c) continue;
      const double f = a[8 * r + c];
      if (f == 0.0) continue;
      for (int j = 0; j < 8; ++j) a[8 * r + j] -= f * a[8 * c + j];
    }
  }
  Mat4 r{};
  for (int i = 0; i < 4; ++i)
    for (int j = 0; j < 4; ++j) r[4 * i + j] = a[8 * i + 4 + j];
  return r;
}

Vec3f transformPoint(const Mat4& m, const Vec3f& p) {
  Vec3f r{};
  for (int i = 0; i < 3; ++i)
    r[i] = static_cast<float>(m[4 * i] * p[0] + m[4 * i + 1] * p[1] + m[4 * i + 2] * p[2] + m[4 * i + 3]);
  return r;
}

Vec3f transformVector(const Mat4& m, const Vec3f& v) {
  Vec3f r{};
  for (int i = 0; i < 3; ++i)
    r[i] = static_cast<float>(m[4 * i] * v[0] + m[4 * i + 1] * v[1] + m[4 * i + 2] * v[2]);
  return r;
}

}  // namespace tessik::bind

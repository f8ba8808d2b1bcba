#pragma once
// Small fixed-size vector arithmetic for Earth-fixed positions and velocities.
#include <array>
#include <cmath>

namespace sar::geometry {

/// X, Y, Z in metres (or metres per second), Earth-fixed unless stated.
using Vec3 = std::array<double, 3>;

inline Vec3 operator+(const Vec3& a, const Vec3& b) { return {a[0] + b[0], a[1] + b[1], a[2] + b[2]}; }
inline Vec3 operator-(const Vec3& a, const Vec3& b) { return {a[0] - b[0], a[1] - b[1], a[2] - b[2]}; }
inline Vec3 operator*(double s, const Vec3& a) { return {s * a[0], s * a[1], s * a[2]}; }
inline double dot(const Vec3& a, const Vec3& b) { return a[0] * b[0] + a[1] * b[1] + a[2] * b[2]; }
inline double norm(const Vec3& a) { return std::sqrt(dot(a, a)); }
inline Vec3 cross(const Vec3& a, const Vec3& b) {
  return {a[1] * b[2] - a[2] * b[1], a[2] * b[0] - a[0] * b[2], a[0] * b[1] - a[1] * b[0]};
}
/// Unit vector along `a`; a zero vector stays zero.
inline Vec3 unit(const Vec3& a) {
  const double n = norm(a);
  return n > 0.0 ? (1.0 / n) * a : Vec3{0.0, 0.0, 0.0};
}

}  // namespace sar::geometry

#pragma once
// exp(j phase) for the per-sample phase terms of the focusing kernels. The C library's sine and
// cosine save and restore the rounding mode on every call, which made them the largest single
// cost of azimuth focusing; this version reduces the argument by pi/2 in three exact parts and
// evaluates the Taylor series of sine and cosine on [-pi/4, pi/4] (truncation below 1e-16).
// Beyond 2^19 quarter turns the reduction would lose exactness, and the library is used.
#include <cmath>
#include <complex>

namespace sar::dsp {

namespace detail {
// pi/2 split so that k * kHalfPi1 and k * kHalfPi2 are exact for |k| < 2^20 (33-bit parts).
inline constexpr double kHalfPi1 = 1.5707963267341256;
inline constexpr double kHalfPi2 = 6.077100506303966e-11;
inline constexpr double kHalfPi3 = 2.0222662487959506e-21;
inline constexpr double kTwoOverPi = 0.6366197723675814;
inline constexpr double kMaxQuarterTurns = 524288.0;  // 2^19

inline double sin_kernel(double r) {
  const double z = r * r;
  // r - r^3/3! + r^5/5! - ... - r^15/15!
  double p = -1.0 / 1307674368000.0;
  p = p * z + 1.0 / 6227020800.0;
  p = p * z - 1.0 / 39916800.0;
  p = p * z + 1.0 / 362880.0;
  p = p * z - 1.0 / 5040.0;
  p = p * z + 1.0 / 120.0;
  p = p * z - 1.0 / 6.0;
  return r + r * z * p;
}

inline double cos_kernel(double r) {
  const double z = r * r;
  // 1 - r^2/2! + r^4/4! - ... + r^16/16!
  double p = 1.0 / 20922789888000.0;
  p = p * z - 1.0 / 87178291200.0;
  p = p * z + 1.0 / 479001600.0;
  p = p * z - 1.0 / 3628800.0;
  p = p * z + 1.0 / 40320.0;
  p = p * z - 1.0 / 720.0;
  p = p * z + 1.0 / 24.0;
  p = p * z - 0.5;
  return 1.0 + z * p;
}
}  // namespace detail

/// weight * exp(j phase), to within a few units in the last place of the library's result.
inline std::complex<double> phasor(double phase, double weight = 1.0) {
  const double q = std::nearbyint(phase * detail::kTwoOverPi);
  if (!(std::abs(q) < detail::kMaxQuarterTurns)) return std::polar(weight, phase);
  const double r = ((phase - q * detail::kHalfPi1) - q * detail::kHalfPi2) - q * detail::kHalfPi3;
  const double s = detail::sin_kernel(r), c = detail::cos_kernel(r);
  switch (static_cast<long long>(q) & 3) {
    case 0: return {weight * c, weight * s};
    case 1: return {-weight * s, weight * c};
    case 2: return {-weight * c, -weight * s};
    default: return {weight * s, -weight * c};
  }
}

}  // namespace sar::dsp

#pragma once
// Orbit polynomials: one polynomial per axis through a few state vectors, and their value,
// first and second derivative. Coefficients are stored highest power first:
// p(t) = c[0] t^(n-1) + ... + c[n-1], with t in seconds from the first state vector of the fit.
#include <span>
#include <vector>

#include "geometry/vec3.hpp"

namespace sar::geometry {

struct OrbitPolynomial {
  std::vector<double> x, y, z;  ///< n coefficients each, highest power first
  int size() const { return static_cast<int>(x.size()); }
};

/// Least-squares fit of `n` coefficients per axis to positions sampled at t0 + i * dt
/// (i = 0 .. positions.size() - 1); with as many positions as coefficients the polynomial
/// passes through every point. Requires positions.size() >= n >= 1 and dt != 0.
OrbitPolynomial orb_interp(double t0, std::span<const Vec3> positions, double dt, int n);

/// Value, first and second derivative of one axis polynomial at t (extended precision sums).
double poly_value(double t, std::span<const double> coef);
double poly_rate(double t, std::span<const double> coef);
double poly_accel(double t, std::span<const double> coef);

struct PosVelAcc {
  Vec3 position{};      ///< m
  Vec3 velocity{};      ///< m/s
  Vec3 acceleration{};  ///< m/s^2
};

/// All three axes and all three orders at t.
PosVelAcc eval_orbit(const OrbitPolynomial& poly, double t);

}  // namespace sar::geometry

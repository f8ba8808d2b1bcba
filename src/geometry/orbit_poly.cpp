#include "geometry/orbit_poly.hpp"

#include <Eigen/Dense>
#include <cmath>
#include <stdexcept>

namespace sar::geometry {

OrbitPolynomial orb_interp(double t0, std::span<const Vec3> positions, double dt, int n) {
  const auto m = static_cast<Eigen::Index>(positions.size());
  if (n < 1 || m < n || dt == 0.0) throw std::invalid_argument("orb_interp: need n >= 1 coefficients, as many points, dt != 0");
  // Powers of x are scaled to x / scale inside the solve, which keeps the system well
  // conditioned for steps of tens of seconds; the scale is taken out of the coefficients after.
  double scale = 0.0;
  for (Eigen::Index i = 0; i < m; ++i) scale = std::max(scale, std::fabs(static_cast<double>(i) * dt + t0));
  if (scale == 0.0) scale = 1.0;
  Eigen::MatrixXd a(m, n);
  Eigen::MatrixXd y(m, 3);
  for (Eigen::Index i = 0; i < m; ++i) {
    const double x = (static_cast<double>(i) * dt + t0) / scale;
    double p = 1.0;
    for (int k = 0; k < n; ++k) {
      a(i, k) = p;
      p *= x;
    }
    for (int ax = 0; ax < 3; ++ax) y(i, ax) = positions[static_cast<std::size_t>(i)][static_cast<std::size_t>(ax)];
  }
  const Eigen::MatrixXd c = a.colPivHouseholderQr().solve(y);  // ascending powers of x / scale
  OrbitPolynomial poly;
  poly.x.resize(static_cast<std::size_t>(n));
  poly.y.resize(static_cast<std::size_t>(n));
  poly.z.resize(static_cast<std::size_t>(n));
  for (int k = 0; k < n; ++k) {
    const double unscale = std::pow(scale, -k);
    const auto at = static_cast<std::size_t>(n - 1 - k);
    poly.x[at] = c(k, 0) * unscale;
    poly.y[at] = c(k, 1) * unscale;
    poly.z[at] = c(k, 2) * unscale;
  }
  return poly;
}

double poly_value(double t, std::span<const double> coef) {
  long double sum = 0.0L, p = 1.0L;
  for (std::size_t k = 0; k < coef.size(); ++k) {
    sum += coef[coef.size() - 1 - k] * p;
    p *= t;
  }
  return static_cast<double>(sum);
}

double poly_rate(double t, std::span<const double> coef) {
  long double sum = 0.0L, p = 1.0L;
  for (std::size_t k = 1; k < coef.size(); ++k) {
    sum += static_cast<long double>(k) * coef[coef.size() - 1 - k] * p;
    p *= t;
  }
  return static_cast<double>(sum);
}

double poly_accel(double t, std::span<const double> coef) {
  long double sum = 0.0L, p = 1.0L;
  for (std::size_t k = 2; k < coef.size(); ++k) {
    sum += static_cast<long double>(k * (k - 1)) * coef[coef.size() - 1 - k] * p;
    p *= t;
  }
  return static_cast<double>(sum);
}

PosVelAcc eval_orbit(const OrbitPolynomial& poly, double t) {
  PosVelAcc out;
  const std::span<const double> c[3] = {poly.x, poly.y, poly.z};
  for (std::size_t a = 0; a < 3; ++a) {
    out.position[a] = poly_value(t, c[a]);
    out.velocity[a] = poly_rate(t, c[a]);
    out.acceleration[a] = poly_accel(t, c[a]);
  }
  return out;
}

}  // namespace sar::geometry

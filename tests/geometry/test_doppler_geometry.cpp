// Doppler centroid, rate, gain and baseline geometry on a closed-form circular orbit.
#include <gtest/gtest.h>

#include <cmath>
#include <numbers>
#include <vector>

#include "geometry/doppler_geometry.hpp"
#include "synthetic_orbit.hpp"

namespace sar::geometry {
namespace {

using testing::CircularOrbit;

constexpr double kLambda = 0.05623564;  // m
constexpr double kDeg = std::numbers::pi / 180.0;
constexpr double kTau = 5.7e-3;         // s, mid swath of IS2
constexpr double kStep = 5.0;           // s between the state vectors

/// Five Earth-fixed positions kStep apart, the middle one at argument of latitude u.
struct Vectors {
  std::vector<Vec3> positions, velocities;
};
Vectors vectors_at(const CircularOrbit& orbit, double u) {
  const double t = orbit.t_ref + (u - orbit.u0) / orbit.mean_motion();
  Vectors v;
  for (int i = -2; i <= 2; ++i) {
    const StateVector s = orbit.earth_fixed(t + i * kStep);
    v.positions.push_back(s.position);
    v.velocities.push_back(s.velocity);
  }
  return v;
}

TEST(DopplerGeometry, EvaluatorsAgreeOnAKnownPolynomial) {
  // x(t) = t^4 - 2 t^3 + 3 t^2 - 4 t + 5, y(t) = 2 t - 1, z(t) = t^4 / 2.
  OrbitPolynomial poly;
  poly.x = {1.0, -2.0, 3.0, -4.0, 5.0};
  poly.y = {0.0, 0.0, 0.0, 2.0, -1.0};
  poly.z = {0.5, 0.0, 0.0, 0.0, 0.0};
  for (const double t : {0.0, -1.5, 20.0}) {
    const double p = (((t - 2.0) * t + 3.0) * t - 4.0) * t + 5.0;
    const double v = ((4.0 * t - 6.0) * t + 6.0) * t - 4.0;
    const double a = (12.0 * t - 12.0) * t + 6.0;
    const double tol = 1e-12 * (1.0 + t * t * t * t);
    Vec3 P{}, V{}, A{};
    POSVELACC_5(t, poly, P, V, A);
    for (const double value : {POSMACRO(t, poly.x), pos(t, poly.x), P[0]}) EXPECT_NEAR(value, p, tol);
    for (const double value : {VELMACRO(t, poly.x), vel(t, poly.x), V[0]}) EXPECT_NEAR(value, v, tol);
    for (const double value : {ACCMACRO(t, poly.x), acc(t, poly.x), A[0]}) EXPECT_NEAR(value, a, tol);
    EXPECT_NEAR(P[1], 2.0 * t - 1.0, tol);
    EXPECT_NEAR(A[2], 6.0 * t * t, tol);
  }
}

TEST(DopplerGeometry, SmallHelpers) {
  EXPECT_EQ(make_versor({0.0, 0.0, 0.0}), (Vec3{0.0, 0.0, 0.0}));
  const Vec3 u = make_versor({3.0, 0.0, -4.0});
  EXPECT_DOUBLE_EQ(u[0], 0.6);
  EXPECT_DOUBLE_EQ(u[2], -0.8);

  EXPECT_EQ(COS_PHI_V({0.0, 0.0, 0.0}, {1.0, 0.0, 0.0}), 0.0);
  EXPECT_DOUBLE_EQ(COS_PHI_V({1.0, 1.0, 0.0}, {2.0, 0.0, 0.0}), std::sqrt(0.5));
  EXPECT_DOUBLE_EQ(COS_PHI_V({1.0, 0.0, 0.0}, {-3.0, 0.0, 0.0}), -1.0);

  const Mat3 m{2.0, 0.0, 1.0, 1.0, 3.0, 0.0, 0.0, 1.0, 4.0};
  EXPECT_DOUBLE_EQ(determ(m), 25.0);
  Mat3 inverse{};
  ASSERT_EQ(inv3x3(m, inverse), 0);
  const Mat3 identity = mul3x3(m, inverse);
  for (std::size_t i = 0; i < 9; ++i) EXPECT_NEAR(identity[i], i % 4 == 0 ? 1.0 : 0.0, 1e-15);
  EXPECT_EQ(inv3x3(Mat3{1.0, 2.0, 3.0, 2.0, 4.0, 6.0, 0.0, 1.0, 1.0}, inverse), 1);
  const Vec3 mv = mul3x1(m, {1.0, -1.0, 2.0});
  EXPECT_EQ(mv, (Vec3{4.0, -2.0, 7.0}));

  // A quadratic through three points is recovered exactly, highest power first.
  const std::array<double, 3> c{-3.0e6, 250.0, 17.5};
  std::array<double, 9> rows{};
  std::array<double, 3> y{}, fit{};
  const double xs[3] = {-2e-4, 1e-5, 3e-4};
  for (std::size_t i = 0; i < 3; ++i) {
    rows[3 * i] = xs[i] * xs[i];
    rows[3 * i + 1] = xs[i];
    rows[3 * i + 2] = 1.0;
    y[i] = fdc_interp(c, xs[i]);
  }
  ASSERT_EQ(MSE_poly(rows, y, fit), 0);
  for (std::size_t i = 0; i < 3; ++i) EXPECT_NEAR(fit[i], c[i], 1e-9 * std::fabs(c[i]));
}

// The argument of latitude in every quadrant, from the node's Earth-fixed state. Negating
// whenever the node velocity is nearer than the node position (instead of beyond 90 degrees)
// gets 45 .. 180 and 225 .. 360 degrees wrong, and the sign of the pitch term with them.
TEST(DopplerGeometry, ArgumentOfLatitudeInAllQuadrants) {
  const CircularOrbit orbit;
  const double node_time = orbit.t_ref - orbit.u0 / orbit.mean_motion();
  const StateVector node = orbit.earth_fixed(node_time);
  for (const double u_deg : {1.0, 30.0, 60.0, 89.0, 91.0, 120.0, 150.0, 179.99, 180.01, 210.0, 240.0, 269.0, 271.0,
                             300.0, 330.0, 359.0}) {
    SCOPED_TRACE(u_deg);
    const double t = node_time + u_deg * kDeg / orbit.mean_motion();
    const double u = compute_ulat(orbit.earth_fixed(t).position, t, node.position, node.velocity, node_time);
    EXPECT_NEAR(std::remainder(u - u_deg * kDeg, 2.0 * std::numbers::pi), 0.0, 1e-9);
    EXPECT_GT(u, -std::numbers::pi);
    EXPECT_LE(u, std::numbers::pi);
  }
}

// The orbital frame is built without dividing by the Z components, so a satellite exactly on
// the equator is no special case.
TEST(DopplerGeometry, BoresightWindowIsRegularOverTheEquator) {
  const double r = 7159500.0, v = 7450.0, inc = 98.55 * kDeg;
  const AttitudeVector att = pointing_law({}, 0.0);
  SlantWindow on{}, near{};
  ASSERT_TRUE(fast_est_spe({r, 0.0, 0.0}, {0.0, v * std::cos(inc), v * std::sin(inc)}, att, 5000, 19207680.0, on));
  ASSERT_TRUE(fast_est_spe({r, 0.0, 1e-3}, {0.0, v * std::cos(inc), v * std::sin(inc)}, att, 5000, 19207680.0, near));
  ASSERT_TRUE(std::isfinite(on.centre));
  EXPECT_NEAR(on.centre, near.centre, 1e-12);
  EXPECT_NEAR(on.far - on.near, 5000.0 / 19207680.0, 1e-15);
  // Boresight at 23 degrees off nadir from 781 km: about 855 km of slant range.
  EXPECT_NEAR(on.centre * kHalfLightSpeed, 855e3, 10e3);
}

TEST(DopplerGeometry, CentroidSitsOnTheBeamCentre) {
  const CircularOrbit orbit;
  for (const double u_deg : {0.0, 50.0, 200.0}) {
    SCOPED_TRACE(u_deg);
    const Vectors v = vectors_at(orbit, u_deg * kDeg);
    PointingLaw law;
    law.a_rad = 0.002;
    const AttitudeVector att = pointing_law(law, u_deg * kDeg);
    const double f = fdc_point(0.0, kTau, att, kLambda, v.positions, -2.0 * kStep, kStep);
    ASSERT_TRUE(std::isfinite(f));
    Vec3 X{};
    ASSERT_EQ(gr_pt(v.positions[2], v.velocities[2], {kTau, f, kLambda, 0.0, 1.0, kWgs84A, kWgs84B}, X), 0);
    double theta = 0.0, phi = 0.0;
    ASSERT_TRUE(antenna_angles(0.0, X, att, v.positions, -2.0 * kStep, kStep, theta, phi));
    // 1e-4 relative on some 500 Hz is 0.05 Hz, some 0.2 microradians of azimuth.
    EXPECT_LT(std::fabs(phi), 1e-6);
    // Doppler rate of a fixed target at the beam centre: about -2 V^2 / (lambda R).
    const double rate = fm_point(0.0, kTau, att, kLambda, v.positions, -2.0 * kStep, kStep);
    EXPECT_NEAR(rate, -2100.0, 60.0);
    // A forward squint a moves the beam centre R a along the ground track, which the Doppler
    // rate turns into a higher centroid.
    law.a_rad = 0.0;
    const double f0 = fdc_point(0.0, kTau, pointing_law(law, u_deg * kDeg), kLambda, v.positions, -2.0 * kStep, kStep);
    const double ground_speed = norm(v.velocities[2]) * norm(X) / norm(v.positions[2]);
    EXPECT_NEAR((f - f0) / (-rate * kTau * kHalfLightSpeed * 0.002 / ground_speed), 1.0, 0.02);
  }
}

TEST(DopplerGeometry, CentroidBeyondTheSearchIntervalEndsAtItsEdge) {
  const CircularOrbit orbit;
  const Vectors v = vectors_at(orbit, 0.7);
  for (const double a : {0.05, -0.05}) {  // some +-12 kHz
    PointingLaw law;
    law.a_rad = a;
    const double f = fdc_point(0.0, kTau, pointing_law(law, 0.7), kLambda, v.positions, -2.0 * kStep, kStep);
    EXPECT_NEAR(f, std::copysign(2000.0, a), 1.0);
  }
}

TEST(DopplerGeometry, GainIsOneAtTheBoresightAndFollowsTheSincPattern) {
  const CircularOrbit orbit;
  const double u = 1.1;
  const Vectors v = vectors_at(orbit, u);
  const double t0 = -2.0 * kStep;
  AttitudeVector att = pointing_law({}, u);
  const double f = fdc_point(0.0, kTau, att, kLambda, v.positions, t0, kStep);
  Vec3 X{};
  ASSERT_EQ(gr_pt(v.positions[2], v.velocities[2], {kTau, f, kLambda, 0.0, 1.0, kWgs84A, kWgs84B}, X), 0);
  // Point the boresight exactly at X: first the elevation, then the azimuth.
  double theta = 0.0, phi = 0.0;
  ASSERT_TRUE(antenna_angles(0.0, X, att, v.positions, t0, kStep, theta, phi));
  att[kElevation] -= theta;
  ASSERT_TRUE(antenna_angles(0.0, X, att, v.positions, t0, kStep, theta, phi));
  att[kAzimuthOffset] -= phi;

  const double L1 = 10.0, L2 = 1.3;
  const std::vector<double> times{0.0};
  std::vector<double> g(1), th(1), ph(1);
  for (const int flag : {0, 1}) {
    ASSERT_EQ(gain(times, X, att, L1, L2, kLambda, flag, v.positions, t0, kStep, g, th, ph), 0);
    EXPECT_NEAR(g[0], 1.0, 1e-12) << "flag " << flag;
    EXPECT_NEAR(th[0], 0.0, 1e-12);
    EXPECT_NEAR(ph[0], 0.0, 1e-12);
  }
  // First null in azimuth; half a null in elevation counts only with the two-axis flag.
  AttitudeVector off = att;
  off[kAzimuthOffset] += std::asin(kLambda / L1);
  ASSERT_EQ(gain(times, X, off, L1, L2, kLambda, 0, v.positions, t0, kStep, g, th, ph), 0);
  EXPECT_LT(g[0], 1e-20);
  off = att;
  off[kElevation] += std::asin(0.5 * kLambda / L2);
  ASSERT_EQ(gain(times, X, off, L1, L2, kLambda, 0, v.positions, t0, kStep, g, th, ph), 0);
  EXPECT_NEAR(g[0], 1.0, 1e-6);
  ASSERT_EQ(gain(times, X, off, L1, L2, kLambda, 1, v.positions, t0, kStep, g, th, ph), 0);
  EXPECT_NEAR(g[0], 4.0 / (std::numbers::pi * std::numbers::pi), 1e-6);
  // Over time the target moves through the beam: R lambda / (L1 V) = 0.72 s from the centre
  // to the first null.
  const std::vector<double> later{0.0, 0.72, -0.72};
  std::vector<double> g3(3), th3(3), ph3(3);
  ASSERT_EQ(gain(later, X, att, L1, L2, kLambda, 0, v.positions, t0, kStep, g3, th3, ph3), 0);
  EXPECT_GT(ph3[1], 0.0);  // behind the beam centre after it
  EXPECT_LT(ph3[2], 0.0);
  EXPECT_NEAR(g3[0], 1.0, 1e-12);
  EXPECT_LT(g3[1], 0.01);
  EXPECT_LT(g3[2], 0.01);
  EXPECT_EQ(gain(later, X, att, L1, L2, kLambda, 0, v.positions, t0, kStep, g, th, ph), 10);
}

TEST(DopplerGeometry, WindowPolynomialsFollowThePointValues) {
  const CircularOrbit orbit;
  const double u = 0.9;
  const Vectors v = vectors_at(orbit, u);
  const double t0 = -2.0 * kStep, fs = 19207680.0;
  std::array<double, 3> cf{}, cr{};
  ASSERT_EQ(fdc_poly(0.0, kTau, v.positions, t0, kStep, kLambda, {}, 5000, fs, cf), 0);
  ASSERT_EQ(fm_poly(0.0, kTau, v.positions, t0, kStep, kLambda, {}, 5000, fs, cr), 0);
  // Between the fit points the polynomials agree with the point values.
  Vec3 P{}, V{}, A{};
  SlantWindow w{};
  const OrbitPolynomial poly = orb_interp(0.0, v.positions, kStep, 5);
  POSVELACC_5(2.0 * kStep, poly, P, V, A);
  const AttitudeVector att = pointing_law({}, Otrulat(P, V + Vec3{-kEarthRotation * P[1], kEarthRotation * P[0], 0.0}));
  ASSERT_TRUE(fast_est_spe(P, V + Vec3{-kEarthRotation * P[1], kEarthRotation * P[0], 0.0}, att, 5000, fs, w));
  const double tau = w.near + 0.25 * (w.far - w.near);
  EXPECT_NEAR(fdc_interp(cf, tau - kTau), fdc_point(0.0, tau, att, kLambda, v.positions, t0, kStep), 0.5);
  EXPECT_NEAR(fdc_interp(cr, tau - kTau) / fm_point(0.0, tau, att, kLambda, v.positions, t0, kStep), 1.0, 1e-4);
}

TEST(DopplerGeometry, BaselineOfARaisedOrbitAndItsFailures) {
  const CircularOrbit master;
  const double u = 0.6;
  const Vectors m = vectors_at(master, u);
  Vectors s = m;  // the same epochs 100 m higher
  for (Vec3& p : s.positions) p = (1.0 + 100.0 / norm(p)) * p;
  BaselineResult out;
  ASSERT_EQ(baseline(2.0 * kStep, m.positions, kStep, s.positions, kStep, kTau, kLambda, 0.0, 1.0, out), 0);
  EXPECT_TRUE(out.message.empty());
  // Straight up by 100 m: in the range plane, along the line of sight by -100 cos(look).
  double squint = 0.0;
  const double look = rr2th(out.master, {0.0, 0.0, 1.0}, out.target, 0, squint) * kDeg;
  EXPECT_NEAR(std::hypot(out.parallel, out.perpendicular, out.cross), 100.0, 1.0);
  EXPECT_NEAR(out.parallel, -100.0 * std::cos(look), 1.5);
  EXPECT_LT(std::fabs(out.cross), 2.0);
  // The higher slave is farther from the target by about the parallel baseline.
  EXPECT_NEAR(out.slave_tau * kHalfLightSpeed - kTau * kHalfLightSpeed, -out.parallel, 0.5);

  for (const double t : {-0.1, 4.0 * kStep + 0.1}) {
    EXPECT_EQ(baseline(t, m.positions, kStep, s.positions, kStep, kTau, kLambda, 0.0, 1.0, out), 12);
    EXPECT_EQ(out.message, "Cannot extrapolate orbit out of bounds\n");
  }
  // A slave that passes a minute later never sees the target within its vectors.
  const Vectors late = vectors_at(master, u + 60.0 * master.mean_motion());
  EXPECT_EQ(baseline(2.0 * kStep, m.positions, kStep, late.positions, kStep, kTau, kLambda, 0.0, 1.0, out), 13);
  EXPECT_FALSE(out.message.empty());
}

}  // namespace
}  // namespace sar::geometry

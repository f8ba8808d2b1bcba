// Range-Doppler geolocation against closed-form geometry and the real DORIS orbit.
#include <gtest/gtest.h>

#include <cmath>
#include <numbers>

#include "geometry/geolocation.hpp"
#include "geometry/orbit_interp.hpp"
#include "synthetic_orbit.hpp"

namespace sar::geometry {
namespace {

using testing::CircularOrbit;
using testing::exact_geodetic;

constexpr double kLambda = 0.05623564;  // m, ASAR C band
constexpr double kDeg = std::numbers::pi / 180.0;

/// Doppler (Hz) of an Earth-fixed target X seen from Earth-fixed (P, V).
double doppler(const Vec3& P, const Vec3& V, const Vec3& X) {
  const Vec3 d = X - P;
  return (2.0 / kLambda) * dot(d, V) / norm(d);
}

struct Located {
  grpt_rec rec;
  StateVector sat;  // state at the azimuth time
};

Located locate(const OrbitData& orbit, double az, double tau, double height, double fdc = 0.0, double side = 1.0) {
  Located out;
  out.rec.azimuth_time = az;
  out.rec.tau = tau;
  out.rec.fdc = fdc;
  out.rec.wavelength = kLambda;
  out.rec.side = side;
  out.rec.height = height;
  EXPECT_EQ(geolocate(orbit, out.rec), 0);
  out.sat = orbit_state_at(orbit, az);
  return out;
}

Vec3 point(const grpt_rec& r) { return {r.x, r.y, r.z}; }

// Forward and back over an IM-like swath: slant time 5.5 to 5.9 ms (820 to 885 km), heights 0
// and 1 km, zero and non-zero Doppler. Tolerances:
//  - range 1 mm and Doppler 1 mHz (2 mm along track): Newton stops at steps below 1e-5 m;
//  - height 1 mm: the target surface is refined until the geodetic height is within 0.1 mm;
//  - back through (lat, lon, h) and inv_grpt 2 mm: Bowring's one-step latitude is exact to
//    micrometres within a few km of the surface.
struct RoundTrip {
  double tau, height, fdc, side;
  double height_tol_m, back_tol_m;
};
const RoundTrip kRoundTrips[] = {
    {5.5e-3, 0.0, 0.0, 1.0, 1e-3, 2e-3},    {5.9e-3, 0.0, 0.0, 1.0, 1e-3, 2e-3},
    {5.7e-3, 0.0, 0.0, -1.0, 1e-3, 2e-3},   {5.7e-3, 1000.0, 0.0, 1.0, 1e-3, 2e-3},
    {5.6e-3, 0.0, 400.0, 1.0, 1e-3, 2e-3},  {5.8e-3, 3000.0, -250.0, 1.0, 1e-3, 2e-3},
};

void check_round_trips(const OrbitData& orbit, double az_first, double az_last, int az_count, double doppler_tol_hz) {
  for (const RoundTrip& c : kRoundTrips) {
    for (int i = 0; i < az_count; ++i) {
      const double az = az_first + (az_last - az_first) * i / std::max(1, az_count - 1);
      SCOPED_TRACE(::testing::Message() << "tau " << c.tau << " h " << c.height << " fdc " << c.fdc << " side "
                                        << c.side << " az " << az);
      const Located l = locate(orbit, az, c.tau, c.height, c.fdc, c.side);
      const Vec3 X = point(l.rec);
      EXPECT_NEAR(norm(X - l.sat.position), c.tau * kHalfLightSpeed, 1e-3) << "slant range, m";
      EXPECT_NEAR(doppler(l.sat.position, l.sat.velocity, X), c.fdc, doppler_tol_hz) << "Hz";
      double lat = 0.0, lon = 0.0, h = 0.0;
      exact_geodetic(X, lat, lon, h);
      EXPECT_NEAR(h, c.height, c.height_tol_m) << "m";
      // Side: right of the track means the cross product (V x up) points to the target.
      EXPECT_GT(c.side * dot(X - l.sat.position, cross(l.sat.velocity, l.sat.position)), 0.0);
      // Back: lat/lon/h to a point, then the time and slant time it is seen at.
      const Vec3 back = geo2cart(l.rec.latitude * kDeg, l.rec.longitude * kDeg, c.height);
      EXPECT_LT(norm(back - X), c.back_tol_m) << "m";
      InverseResult inv;
      ASSERT_EQ(inv_grpt(l.rec.state_vectors, back, l.rec.dt, kLambda, c.fdc, inv), 0);
      EXPECT_NEAR(inv.tau * kHalfLightSpeed, c.tau * kHalfLightSpeed, c.back_tol_m) << "m";
      EXPECT_NEAR((inv.time + l.rec.t0 - az) * l.rec.ground_velocity, 0.0, c.back_tol_m) << "m along track";
    }
  }
}

TEST(Geolocation, RoundTripsOnCircularOrbit) {
  const CircularOrbit orbit;
  const OrbitData d = orbit.table(-1200.0, 60.0, 41);
  check_round_trips(d, d.sensing_start + 60.0, d.sensing_stop - 60.0, 9, 1e-3);
}

TEST(Geolocation, RoundTripsOnRealOrbit) {
  const OrbitData d = read_orbit(testing::real_file(testing::kVor));
  // The geolocation takes its velocity from the fit through five positions; the file's own
  // velocities differ from that derivative by some 1e-5 m/s, i.e. about 1.5 mHz of Doppler
  // (3 mm along track), hence 5 mHz here.
  check_round_trips(d, d.sensing_start + 100.0, d.sensing_stop - 100.0, 12, 5e-3);
}

/// Zero-Doppler time of X by brute force on the closed-form orbit: a 1 s scan, then bisection.
double zero_doppler_time(const CircularOrbit& orbit, const Vec3& X, double t0, double t1) {
  auto f = [&](double t) {
    const StateVector s = orbit.earth_fixed(t);
    return dot(X - s.position, s.velocity);
  };
  double lo = t0;
  while (lo + 1.0 < t1 && (f(lo) > 0.0) == (f(lo + 1.0) > 0.0)) lo += 1.0;
  double hi = lo + 1.0;
  for (int i = 0; i < 80; ++i) {
    const double mid = 0.5 * (lo + hi);
    ((f(mid) > 0.0) == (f(lo) > 0.0) ? lo : hi) = mid;
  }
  return 0.5 * (lo + hi);
}

TEST(Geolocation, KnownTargetsFoundWithinTenCentimetres) {
  // A target placed on the ellipsoid; its zero-Doppler time and range come from the closed
  // form, not from the code under test. The orbit file holds records every 60 s.
  const CircularOrbit orbit;
  const OrbitData d = orbit.table(-1200.0, 60.0, 41);
  const StateVector mid = orbit.earth_fixed(orbit.t_ref);
  double slat = 0.0, slon = 0.0, sh = 0.0;
  exact_geodetic(mid.position, slat, slon, sh);
  struct Target {
    double dlat_deg, dlon_deg;
  };
  for (const Target& tg : {Target{0.0, 3.5}, Target{0.5, 4.0}, Target{-0.7, 3.2}}) {
    const Vec3 X = geo2cart(slat + tg.dlat_deg * kDeg, slon + tg.dlon_deg * kDeg, 0.0);
    const double tz = zero_doppler_time(orbit, X, orbit.t_ref - 300.0, orbit.t_ref + 300.0);
    const StateVector s = orbit.earth_fixed(tz);
    const double tau = norm(X - s.position) / kHalfLightSpeed;
    const double side = dot(X - s.position, cross(s.velocity, s.position)) > 0.0 ? 1.0 : -1.0;
    const Located l = locate(d, tz, tau, 0.0, 0.0, side);
    EXPECT_LT(norm(point(l.rec) - X), 0.1) << "m";
    double lat = 0.0, lon = 0.0, h = 0.0;
    exact_geodetic(X, lat, lon, h);
    EXPECT_NEAR(l.rec.latitude, lat / kDeg, 1e-6);  // 1e-6 deg is 0.1 m
    EXPECT_NEAR(l.rec.longitude, lon / kDeg, 1e-6);
    // Back to the time and range.
    InverseResult inv;
    ASSERT_EQ(inv_grpt(l.rec.state_vectors, X, l.rec.dt, kLambda, 0.0, inv), 0);
    EXPECT_NEAR((inv.time + l.rec.t0 - tz) * l.rec.ground_velocity, 0.0, 0.1) << "m";
    EXPECT_NEAR(inv.tau * kHalfLightSpeed, tau * kHalfLightSpeed, 0.01) << "m";

    // An orbit whose epochs are 1 ms late puts the same target about 7 m along track away:
    // the checks above would catch a timing fault of that size.
    OrbitData late = d;
    for (StateVector& sv : late.vectors) sv.time += 1e-3;
    late.sensing_start += 1e-3;
    late.sensing_stop += 1e-3;
    const Located shifted = locate(late, tz, tau, 0.0, 0.0, side);
    const double moved = norm(point(shifted.rec) - X);
    EXPECT_GT(moved, 6.0);
    EXPECT_LT(moved, 8.0);
  }
}

TEST(Geolocation, DopplerRateMatchesTheRangeHistory) {
  // Rate of the Doppler of a fixed target along the orbit, by central differences of the
  // closed-form range history: the osculating-circle rate agrees to 0.1 %.
  const CircularOrbit orbit;
  const OrbitData d = orbit.table(-1200.0, 60.0, 41);
  for (double tau : {5.5e-3, 5.9e-3}) {
    const Located l = locate(d, orbit.t_ref + 17.0, tau, 0.0);
    const Vec3 X = point(l.rec);
    const double h = 0.01;
    auto f = [&](double t) {
      const StateVector s = orbit.earth_fixed(t);
      return doppler(s.position, s.velocity, X);
    };
    const double truth = (f(orbit.t_ref + 17.0 + h) - f(orbit.t_ref + 17.0 - h)) / (2.0 * h);
    EXPECT_NEAR(l.rec.doppler_rate, truth, 1e-3 * std::fabs(truth)) << "Hz/s";
    EXPECT_LT(truth, -1500.0);  // about -2 V^2 / (lambda R)
    // The central-force form from one state agrees as well.
    grpt_rec r = l.rec;
    ASSERT_EQ(gr_pt_lat_lon_s(r, l.sat.position, l.sat.velocity), 0);
    EXPECT_NEAR(r.doppler_rate, truth, 1e-2 * std::fabs(truth)) << "Hz/s";
    // Angles: the look angle is smaller than the incidence angle, both near 16 to 26 degrees.
    EXPECT_GT(l.rec.incidence, l.rec.look);
    EXPECT_GT(l.rec.look, 10.0);
    EXPECT_LT(l.rec.incidence, 35.0);
  }
}

TEST(Geolocation, StatusAndEdgeCases) {
  const CircularOrbit orbit;
  const OrbitData d = orbit.table(-1200.0, 60.0, 41);
  Located l = locate(d, orbit.t_ref, 5.7e-3, 0.0);
  // Out of the five-vector fit: more than dt/2 beyond either end.
  grpt_rec r = l.rec;
  r.azimuth_time = r.t0 - 0.6 * r.dt;
  EXPECT_EQ(gr_pt_lat_lon(r), geo_status::kOutOfFit);
  r.azimuth_time = r.t0 + 4.6 * r.dt;
  EXPECT_EQ(gr_pt_lat_lon(r), geo_status::kOutOfFit);
  // A slant range shorter than the altitude misses the Earth.
  r = l.rec;
  r.tau = 4.0e-3;
  EXPECT_EQ(gr_pt_lat_lon(r), geo_status::kNoIntersection);
  // inv_grpt refuses a target seen outside the state vectors' span.
  const Vec3 far = geo2cart(l.rec.latitude * kDeg + 10.0 * kDeg, l.rec.longitude * kDeg, 0.0);
  InverseResult inv;
  EXPECT_EQ(inv_grpt(l.rec.state_vectors, far, l.rec.dt, kLambda, 0.0, inv), geo_status::kCannotExtrapolate);
  const OrbitPolynomial poly = orb_interp(0.0, l.rec.state_vectors, l.rec.dt, 5);
  EXPECT_EQ(inv_grpt_opt(poly, far, 4.0 * l.rec.dt, kLambda, 0.0, inv), geo_status::kCannotExtrapolate);
  ASSERT_EQ(inv_grpt_opt(poly, point(l.rec), 4.0 * l.rec.dt, kLambda, 0.0, inv), 0);
  EXPECT_NEAR(inv.time + l.rec.t0, orbit.t_ref, 1e-5);
  // Poles: on the axis the latitude is exactly +-90 degrees.
  double lat = 0.0, lon = 0.0;
  xyz2geo({0.0, 0.0, kWgs84B}, lat, lon);
  EXPECT_EQ(lat, std::numbers::pi / 2.0);
  xyz2geo({0.0, 0.0, -kWgs84B}, lat, lon);
  EXPECT_EQ(lat, -std::numbers::pi / 2.0);
  // Heading of this retrograde orbit: ascending flies north-west, descending south-west.
  const Located asc = locate(d, orbit.t_ref, 5.7e-3, 0.0);
  EXPECT_LT(asc.rec.heading, 0.0);
  EXPECT_GT(asc.rec.heading, -30.0);
}

TEST(Geolocation, GeodeticConversions) {
  struct Case {
    double lat_deg, lon_deg, h;
  };
  for (const Case& c : {Case{0.0, 0.0, 0.0}, Case{45.0, 10.0, 0.0}, Case{-67.5, -120.0, 2000.0}, Case{89.9, 45.0, 0.0}}) {
    const Vec3 x = geo2cart(c.lat_deg * kDeg, c.lon_deg * kDeg, c.h);
    double lat = 0.0, lon = 0.0, h = 0.0;
    exact_geodetic(x, lat, lon, h);
    EXPECT_NEAR(lat / kDeg, c.lat_deg, 1e-9);
    EXPECT_NEAR(lon / kDeg, c.lon_deg, 1e-9);
    EXPECT_NEAR(h, c.h, 1e-6);
    xyz2geo(x, lat, lon);
    EXPECT_NEAR(lat / kDeg, c.lat_deg, c.h == 0.0 ? 1e-9 : 1e-6);  // Bowring one step: exact on the surface
  }
}

TEST(Geolocation, TrueArgumentOfLatitude) {
  // Inertial states of the closed-form orbit: the argument of latitude grows with the mean motion.
  const CircularOrbit orbit;
  for (double dt : {0.0, 1000.0, 2500.0, 4000.0}) {
    Vec3 p, v;
    orbit.inertial(orbit.t_ref + dt, p, v);
    const double u = orbit.u0 + orbit.mean_motion() * dt;
    const double got = Otrulat(p, v);
    EXPECT_NEAR(std::remainder(got - u, 2.0 * std::numbers::pi), 0.0, 1e-6);
  }
}

}  // namespace
}  // namespace sar::geometry

// Geometry polynomials of a stripmap scene: fits, slot layout, and the geometry they describe
// for a real ENVISAT orbit and a closed-form circular one.
#include <cmath>
#include <filesystem>
#include <vector>

#include <gtest/gtest.h>

#include "../geometry/synthetic_orbit.hpp"
#include "geometry/orbit_interp.hpp"
#include "stripmap/geopoly.hpp"

namespace {

using sar::metadata::sarpar;
using sar::geometry::OrbitData;
using sar::geometry::Vec3;
using sar::stripmap::DCeval;
using sar::stripmap::DopplerPoly;
using sar::stripmap::procparm;

constexpr double kLightSpeed = 299792458.0;

/// An IS2-like acquisition of 18 s starting at t0.
sarpar is2_scene(double t0) {
  sarpar par;
  par.prf = 1652.4;
  par.samplingRate = 19.208e6;
  par.carrierFrequency = 5.331e9;
  par.nearRangeTime = 5.5e-3;
  par.samples = 5200;
  par.lines = 30000;
  par.azimuthStartTime = t0;
  return par;
}

/// The orbit block as the job fills it: five vectors a third of the scene apart, centred on it.
procparm orbit_block(const OrbitData& orbit, const sarpar& par) {
  procparm proc;
  const double duration = par.lines / par.prf;
  proc.orbitSpacing = duration / 3.0;
  proc.orbitStartTime = par.azimuthStartTime - proc.orbitSpacing / 2.0;
  for (int k = 0; k < 5; ++k) {
    const auto sv = sar::geometry::orbit_state_at(orbit, proc.orbitStartTime + k * proc.orbitSpacing);
    for (int a = 0; a < 3; ++a) {
      proc.orbitPositions[static_cast<size_t>(3 * k + a)] = sv.position[static_cast<size_t>(a)];
      proc.orbitVelocities[static_cast<size_t>(3 * k + a)] = sv.velocity[static_cast<size_t>(a)];
    }
  }
  // A centroid of some 100 Hz, slowly varying: the geometry must take it, not zero.
  proc.dopplerCentroid = {100.0, 2.0e5, 0.5, 0, 0, 0, 0, par.nearRangeTime, par.azimuthStartTime + duration / 2};
  return proc;
}

struct Grid {
  std::vector<double> rate, incidence, look;
};

/// The ten-point grid getgeopoly fits, computed on its own.
Grid reference_grid(const sarpar& par, const procparm& proc) {
  Grid g{std::vector<double>(10), std::vector<double>(10), std::vector<double>(10)};
  std::array<Vec3, 5> sv{};
  for (size_t k = 0; k < 5; ++k)
    sv[k] = {proc.orbitPositions[3 * k], proc.orbitPositions[3 * k + 1], proc.orbitPositions[3 * k + 2]};
  const double centre = par.azimuthStartTime + 0.5 * par.lines / par.prf;
  const double step = par.samples / par.samplingRate / 9.0;
  EXPECT_EQ(
      sar::stripmap::get_geo_grid(centre, par.nearRangeTime, 1, 10, 0.0, step, g.rate, g.incidence, g.look, sv,
                                  proc.orbitStartTime, proc.orbitSpacing, par.carrierFrequency, proc.dopplerCentroid),
      0);
  return g;
}

/// Checks of the three polynomials against the grid and against first-order geometry.
void check_geometry(const sarpar& par, const procparm& proc) {
  const Grid g = reference_grid(par, proc);
  const double step = par.samples / par.samplingRate / 9.0;
  const double centre = par.azimuthStartTime + 0.5 * par.lines / par.prf;

  for (const DopplerPoly* slot : {&proc.dopplerRate, &proc.lookAngle, &proc.incidenceAngle}) {
    EXPECT_EQ((*slot)[2], 0.0);
    EXPECT_EQ((*slot)[3], 0.0);
    EXPECT_EQ((*slot)[7], par.nearRangeTime);
    EXPECT_EQ((*slot)[8], 0.0);
  }
  EXPECT_EQ(proc.dopplerRate[5], 0.0);  // degree 2
  EXPECT_EQ(proc.dopplerRate[6], 0.0);

  for (int j : {0, 4, 9}) {
    const double tau = par.nearRangeTime + j * step;
    // Least-squares fits of ten points need not pass through them, but come close.
    EXPECT_NEAR(DCeval(proc.lookAngle, tau, centre), g.look[static_cast<size_t>(j)], 2e-3) << j;
    EXPECT_NEAR(DCeval(proc.incidenceAngle, tau, centre), g.incidence[static_cast<size_t>(j)], 2e-3) << j;
    EXPECT_NEAR(DCeval(proc.dopplerRate, tau, centre), g.rate[static_cast<size_t>(j)],
                1e-3 * std::fabs(g.rate[static_cast<size_t>(j)]))
        << j;
  }

  // Degrees, not radians: an IS2-like swath looks some 12 to 25 degrees off nadir, and the
  // Earth's curvature makes the incidence a few degrees steeper.
  EXPECT_GT(proc.lookAngle[0], 10.0);
  EXPECT_LT(proc.lookAngle[0], 25.0);
  const double farLook = DCeval(proc.lookAngle, par.nearRangeTime + 9 * step, 0.0);
  EXPECT_GT(farLook, proc.lookAngle[0] + 3.0);
  EXPECT_GT(proc.incidenceAngle[0], proc.lookAngle[0] + 1.0);
  EXPECT_LT(proc.incidenceAngle[0], proc.lookAngle[0] + 4.0);

  // Doppler rate of a satellite at some 7.5 km/s seen from 825 to 900 km: about
  // -2 V^2 / (lambda R), a little less in magnitude since the ground moves along with it.
  const Vec3 v{proc.orbitVelocities[6], proc.orbitVelocities[7], proc.orbitVelocities[8]};
  const double speed = sar::geometry::norm(v);
  const double lambda = kLightSpeed / par.carrierFrequency;
  for (int j : {0, 9}) {
    const double tau = par.nearRangeTime + j * step;
    const double straight = -2.0 * speed * speed / (lambda * tau * kLightSpeed / 2.0);
    const double rate = DCeval(proc.dopplerRate, tau, centre);
    EXPECT_LT(rate, 0.0);
    EXPECT_GT(rate / straight, 0.8) << j;
    EXPECT_LT(rate / straight, 1.0) << j;
  }
}

TEST(GeoPoly, PolfitRecoversPolynomialsInMicrosecondAbscissae) {
  std::vector<double> x(10), y2(10), y4(10);
  for (int j = 0; j < 10; ++j) {
    const double t = j * 3e-6;
    x[static_cast<size_t>(j)] = t;
    y2[static_cast<size_t>(j)] = -2100.0 + 1.5e7 * t + 4e11 * t * t;
    y4[static_cast<size_t>(j)] = 18.0 + 2e5 * t - 3e9 * t * t + 7e13 * t * t * t - 2e18 * t * t * t * t;
  }
  std::vector<double> c2(3), c4(5);
  ASSERT_EQ(sar::stripmap::polfit(x, y2, c2, 2), 0);
  EXPECT_NEAR(c2[0], -2100.0, 1e-8);
  EXPECT_NEAR(c2[1] / 1.5e7, 1.0, 1e-9);
  EXPECT_NEAR(c2[2] / 4e11, 1.0, 1e-6);
  ASSERT_EQ(sar::stripmap::polfit(x, y4, c4, 4), 0);
  EXPECT_NEAR(c4[0], 18.0, 1e-9);
  EXPECT_NEAR(c4[4] / -2e18, 1.0, 1e-3);

  std::vector<double> tooMany(12);
  EXPECT_EQ(sar::stripmap::polfit(x, y2, tooMany, 11), 10);
}

TEST(GeoPoly, SlotLayoutFitsTheMiddleRowFromTheNearRange) {
  // Three rows; only the middle one (index 1) is fitted.
  const double step = 2e-6;
  std::vector<double> grid(30, 1e9);
  for (int j = 0; j < 10; ++j) {
    const double x = j * step;
    grid[static_cast<size_t>(10 + j)] = 5.0 + 1e5 * x + 1e9 * x * x + 1e14 * x * x * x - 1e19 * x * x * x * x;
  }
  DopplerPoly slot;
  slot.fill(99.0);
  ASSERT_EQ(sar::stripmap::get_poly(0.0, 6e-3, 3, 10, 1.0, step, grid, slot, 4), 0);
  EXPECT_NEAR(slot[0], 5.0, 1e-9);
  EXPECT_NEAR(slot[1] / 1e5, 1.0, 1e-6);
  EXPECT_EQ(slot[2], 0.0);
  EXPECT_EQ(slot[3], 0.0);
  EXPECT_NEAR(slot[4] / 1e9, 1.0, 1e-4);
  EXPECT_NEAR(slot[5] / 1e14, 1.0, 1e-3);
  EXPECT_NEAR(slot[6] / -1e19, 1.0, 1e-2);
  EXPECT_EQ(slot[7], 6e-3);
  EXPECT_EQ(slot[8], 0.0);
  // A degree 2 fit clears the higher entries.
  ASSERT_EQ(sar::stripmap::get_poly(0.0, 6e-3, 3, 10, 1.0, step, grid, slot, 2), 0);
  EXPECT_EQ(slot[5], 0.0);
  EXPECT_EQ(slot[6], 0.0);
  // A grid shorter than its stated size is refused: 7 rows put the middle one at 30..39.
  EXPECT_EQ(sar::stripmap::get_poly(0.0, 6e-3, 7, 10, 1.0, step, grid, slot, 2), 10);
}

TEST(GeoPoly, RealEnvisatOrbitGivesTheSceneGeometryBeforeAzimuthFocusing) {
  const std::string path = sar::geometry::testing::real_file(sar::geometry::testing::kVor);
  if (!std::filesystem::exists(path)) GTEST_SKIP() << "no real orbit file " << path;
  const OrbitData orbit = sar::geometry::read_orbit(path);
  const sarpar par = is2_scene(orbit.sensing_start + 4000.0);
  procparm proc = orbit_block(orbit, par);
  // Nothing of azimuth focusing is known yet.
  ASSERT_EQ(proc.focusedLines, 0);
  ASSERT_EQ(proc.firstLineTime, 0.0);
  ASSERT_EQ(sar::stripmap::getgeopoly(par, proc), 0);
  check_geometry(par, proc);
}

TEST(GeoPoly, CircularOrbitMatchesSphericalGeometry) {
  const sar::geometry::testing::CircularOrbit circle;
  const OrbitData orbit = circle.table(-300.0, 10.0, 60);
  const sarpar par = is2_scene(circle.t_ref);
  procparm proc = orbit_block(orbit, par);
  ASSERT_EQ(sar::stripmap::getgeopoly(par, proc), 0);
  check_geometry(par, proc);

  // Law of cosines in the plane of satellite, Earth centre and target, with the Earth radius
  // under the satellite: good to a few tenths of a degree at these ranges.
  const double centre = par.azimuthStartTime + 0.5 * par.lines / par.prf;
  const auto sv = circle.earth_fixed(centre);
  double lat = 0.0, lon = 0.0, h = 0.0;
  sar::geometry::testing::exact_geodetic(sv.position, lat, lon, h);
  const double rs = sar::geometry::norm(sv.position);
  const Vec3 ground = sar::geometry::geo2cart(lat, lon, 0.0);
  const double re = sar::geometry::norm(ground);
  const double r = par.nearRangeTime * kLightSpeed / 2.0;
  const double look = std::acos((rs * rs + r * r - re * re) / (2.0 * rs * r)) * 180.0 / M_PI;
  const double incidence = std::asin(rs / re * std::sin(look * M_PI / 180.0)) * 180.0 / M_PI;
  EXPECT_NEAR(proc.lookAngle[0], look, 0.3);
  EXPECT_NEAR(proc.incidenceAngle[0], incidence, 0.3);
}

TEST(GeoPoly, UnusableAcquisitionParametersAreRejected) {
  sarpar par = is2_scene(7e8);
  procparm proc;
  proc.orbitSpacing = 6.0;
  par.prf = 0.0;
  EXPECT_EQ(sar::stripmap::getgeopoly(par, proc), 10);
  par = is2_scene(7e8);
  proc.orbitSpacing = 0.0;
  EXPECT_EQ(sar::stripmap::getgeopoly(par, proc), 10);
}

}  // namespace

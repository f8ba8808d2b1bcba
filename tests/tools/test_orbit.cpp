// Orbit model and DOR_VOR writer of the simulator.
#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <string>

#include "header_shape.hpp"
#include "base/convert.hpp"
#include "envisat/product_types.hpp"
#include "simulator/attitude.hpp"
#include "simulator/orbit_file.hpp"
#include "simulator/orbit_model.hpp"

namespace sim = sar::simulator;

namespace {

using sar::test::header_shape;
using sar::test::read_all;

std::string real_orbit_file() {
  for (const auto& e : std::filesystem::directory_iterator(std::string(SAR_REAL_DATA_DIR) + "/DOR_VOR_AX"))
    return e.path().string();
  return {};
}

const double kScene = sar::base::ascii2sec85("02-MAR-2008 10:00:00.000000");

}  // namespace

TEST(OrbitModel, GeodeticConversionRoundTrips) {
  for (const sim::Geodetic g : {sim::Geodetic{0.0, 0.0, 0.0}, sim::Geodetic{45.0, 10.0, 120.0},
                                sim::Geodetic{-71.5, -123.25, 3500.0}, sim::Geodetic{89.9, 179.0, -50.0}}) {
    const sim::Geodetic back = sim::ecef_to_geodetic(sim::geodetic_to_ecef(g));
    EXPECT_NEAR(back.lat_deg, g.lat_deg, 1e-9);
    EXPECT_NEAR(back.lon_deg, g.lon_deg, 1e-9);
    EXPECT_NEAR(back.height, g.height, 1e-4);
  }
  EXPECT_NEAR(sim::geodetic_to_ecef({90.0, 0.0, 0.0}).z, sim::kWgs84B, 1e-6);
}

TEST(OrbitModel, IsARealisticEnvisatOrbit) {
  const sim::OrbitModel orbit = sim::OrbitModel::for_scene({45.0, 10.0, 0.0}, kScene, 23.0, false, 31400);
  EXPECT_NEAR(orbit.period() / 60.0, 100.6, 0.05);
  double max_lat = 0.0;
  for (double dt = 0.0; dt < orbit.period(); dt += 20.0) {
    const sim::StateVector s = orbit.state_at_offset(dt);
    const sim::Geodetic g = sim::ecef_to_geodetic(s.position);
    EXPECT_GT(g.height, 765e3);
    EXPECT_LT(g.height, 805e3);
    max_lat = std::max(max_lat, std::abs(g.lat_deg));
    // The velocity is the derivative of the position.
    const double h = 0.01;
    const sim::Vec3 numeric =
        (orbit.state_at_offset(dt + h).position - orbit.state_at_offset(dt - h).position) * (0.5 / h);
    EXPECT_LT((numeric - s.velocity).norm(), 1e-3);
  }
  EXPECT_NEAR(max_lat, 180.0 - 98.55, 0.3);  // geodetic latitude of the highest point
}

// The radius follows the ellipsoid: the geodetic altitude hardly moves over an orbit while the
// radius drops by some 21 km towards the poles, and the radial velocity is the ellipsoid's
// -(a - b) sin^2(i) sin(2u) du/dt, about 22 m/s. The circular orbit keeps neither.
TEST(OrbitModel, RadiusFollowsTheEllipsoid) {
  const sim::OrbitModel orbit = sim::OrbitModel::for_scene({45.0, 10.0, 0.0}, kScene, 23.0, false, 31400);
  const double n = orbit.elements().mean_motion, u0 = orbit.elements().arg_latitude;
  const double si = std::sin(orbit.elements().inclination_deg * sim::kPi / 180.0);
  double h_min = 1e9, h_max = -1e9, vr_max = 0.0;
  for (double dt = 0.0; dt < orbit.period(); dt += 30.0) {
    const sim::StateVector s = orbit.state_at_offset(dt);
    const double h = sim::ecef_to_geodetic(s.position).height;
    h_min = std::min(h_min, h);
    h_max = std::max(h_max, h);
    const double u = u0 + n * dt;
    EXPECT_NEAR(s.position.norm(), orbit.radius(u), 1e-6);
    const double vr = s.velocity.dot(s.position.unit());
    EXPECT_NEAR(vr, -(sim::kWgs84A - sim::kWgs84B) * si * si * std::sin(2.0 * u) * n, 1e-6);
    vr_max = std::max(vr_max, std::abs(vr));
  }
  EXPECT_LT(h_max - h_min, 200.0);
  EXPECT_NEAR(vr_max, 21.8, 0.2);
  EXPECT_NEAR(orbit.radius(0.0) - orbit.radius(sim::kPi / 2.0), 21385.0 * si * si, 1.0);

  sim::OrbitElements circular = orbit.elements();
  circular.radius_dip = 0.0;
  const sim::OrbitModel round(circular);
  double round_min = 1e9, round_max = -1e9;
  for (double dt = 0.0; dt < orbit.period(); dt += 30.0) {
    const sim::StateVector s = round.state_at_offset(dt);
    EXPECT_NEAR(s.velocity.dot(s.position.unit()), 0.0, 1e-6);
    const double h = sim::ecef_to_geodetic(s.position).height;
    round_min = std::min(round_min, h);
    round_max = std::max(round_max, h);
  }
  EXPECT_GT(round_max - round_min, 20e3);
}

// ENVISAT's yaw-steering law keeps the beam-centre Doppler near zero all round this orbit, at
// near, mid and far range. Its pitch term answers the radial velocity of an orbit that follows
// the ellipsoid: the sin(2u) part of the centroid stays within a few hertz, where a circular
// orbit leaves some 750 Hz. What remains is a cos(u) part of about 29 Hz at mid range from the
// yaw term (its amplitude p is some 0.015 deg short of cancelling this orbit's Earth rotation).
TEST(OrbitModel, YawSteeringKeepsTheCentroidNearZeroAllRound) {
  const double wavelength = sim::kSpeedOfLight / 5.331004416e9;
  const sim::Attitude steered;  // yaw steering, no squint
  constexpr int kSteps = 72;
  for (const bool ascending : {false, true}) {
    SCOPED_TRACE(ascending ? "ascending" : "descending");
    const sim::OrbitModel orbit = sim::OrbitModel::for_scene({45.0, 10.0, 0.0}, kScene, 23.0, ascending, 31400);
    sim::OrbitElements circular = orbit.elements();
    circular.radius_dip = 0.0;
    const sim::OrbitModel round(circular);
    double worst = 0.0, sin2u = 0.0, cosu = 0.0, sin2u_round = 0.0;
    for (int k = 0; k < kSteps; ++k) {
      const double t = kScene + k * orbit.period() / kSteps;
      const double u = sim::argument_of_latitude(orbit, t);
      for (const double tau : {5.5e-3, 5.75e-3, 6.0e-3})
        worst = std::max(worst, std::abs(sim::beam_centre_doppler(orbit, steered, t, tau, wavelength)));
      const double mid = sim::beam_centre_doppler(orbit, steered, t, 5.75e-3, wavelength);
      sin2u += 2.0 / kSteps * mid * std::sin(2.0 * u);
      cosu += 2.0 / kSteps * mid * std::cos(u);
      sin2u_round += 2.0 / kSteps * sim::beam_centre_doppler(round, steered, t, 5.75e-3, wavelength) * std::sin(2.0 * u);
    }
    EXPECT_LT(std::abs(sin2u), 8.0);
    EXPECT_GT(std::abs(sin2u_round), 700.0);
    EXPECT_LT(std::abs(cosu), 32.0);
    EXPECT_LT(worst, 40.0);
  }
}

TEST(OrbitModel, SceneTargetIsSeenAtZeroDopplerToTheRight) {
  const sim::Geodetic target{45.0, 10.0, 0.0};
  const sim::Vec3 p = sim::geodetic_to_ecef(target);
  for (const bool ascending : {false, true}) {
    const sim::OrbitModel orbit = sim::OrbitModel::for_scene(target, kScene, 23.0, ascending, 31400);
    EXPECT_NEAR(sim::zero_doppler_offset(orbit, p, 30.0), 0.0, 1e-6);
    const sim::StateVector s = orbit.state(kScene);
    EXPECT_EQ(s.velocity.z > 0.0, ascending);
    const sim::Vec3 d = p - s.position;
    EXPECT_GT(d.dot(s.velocity.cross(s.position.unit())), 0.0) << "target must be on the right";
    const double incidence = std::acos((s.position - p).unit().dot(p.unit())) * 180.0 / sim::kPi;
    EXPECT_NEAR(incidence, 23.0, 0.5);
  }
}

TEST(OrbitModel, OrbitNumberStepsAtTheAscendingNode) {
  const sim::OrbitModel orbit = sim::OrbitModel::for_scene({45.0, 10.0, 0.0}, kScene, 23.0, false, 31400);
  EXPECT_EQ(orbit.absolute_orbit(kScene), 31400);
  const double node = orbit.ascending_node_before(kScene);
  EXPECT_LT(node, kScene);
  EXPECT_GT(node, kScene - orbit.period());
  EXPECT_NEAR(orbit.state(node).position.z, 0.0, 1e-3);
  EXPECT_EQ(orbit.absolute_orbit(node + 1e-3), 31400);
  EXPECT_EQ(orbit.absolute_orbit(node - 1e-3), 31399);
}

TEST(OrbitFile, TypesAsDorVorAndMatchesTheRealLayout) {
  const std::string dir = std::string(SAR_BINARY_DIR) + "/test_tools_orbit";
  std::filesystem::remove_all(dir);
  std::filesystem::create_directories(dir);
  const sim::OrbitModel orbit = sim::OrbitModel::for_scene({45.0, 10.0, 0.0}, kScene, 23.0, false, 31400);
  sim::OrbitFileRequest request;
  request.start = kScene - 3600.0;
  request.stop = kScene + 3600.0;
  const std::string path = sim::write_orbit_file(orbit, request, dir);

  sar::envisat::EnvisatTypes types(path);
  EXPECT_TRUE(types.is_dorvor());
  EXPECT_EQ(types.find_type(), sar::envisat::kDorVor);

  const std::string mine = read_all(path);
  const std::string real = read_all(real_orbit_file());
  ASSERT_GT(real.size(), 1625u);
  EXPECT_EQ(header_shape(mine.substr(0, 1625)), header_shape(real.substr(0, 1625)));
  EXPECT_EQ(mine.size(), 1625u + 121u * 129u);
  EXPECT_EQ(std::stoll(mine.substr(1247 + 231, 21)), 1625);  // data offset in the SPH
  EXPECT_EQ(std::stoll(mine.substr(1247 + 305, 11)), 121);   // record count in the SPH
  EXPECT_EQ(std::stoll(mine.substr(mine.find("TOT_SIZE=") + 9, 21)), static_cast<long long>(mine.size()));
  EXPECT_EQ(mine.substr(351, 27), "02-MAR-2008 09:00:00.000000");
  EXPECT_EQ(mine.substr(394, 27), "02-MAR-2008 11:00:00.000000");

  // Every record parses at the positions the real records use, and holds the model's state.
  for (int k = 0; k < 121; ++k) {
    const std::string rec = mine.substr(1625 + 129 * static_cast<std::size_t>(k), 129);
    ASSERT_EQ(rec.back(), '\n');
    const double t = sar::base::ascii2sec85(rec.substr(0, 27));
    EXPECT_DOUBLE_EQ(t, request.start + 60.0 * k);
    const sim::StateVector s = orbit.state(t);
    EXPECT_EQ(std::stoi(rec.substr(37, 6)), orbit.absolute_orbit(t));
    const double values[6] = {s.position.x, s.position.y, s.position.z, s.velocity.x, s.velocity.y, s.velocity.z};
    for (int i = 0; i < 6; ++i) EXPECT_NEAR(std::stod(rec.substr(44 + 13 * static_cast<std::size_t>(i), 12)), values[i], 1e-3);
  }
  // Structure of one record against a real one: blanks and signs in the same columns.
  const std::string real_rec = real.substr(1625, 129);
  const std::string my_rec = mine.substr(1625, 129);
  for (std::size_t i = 0; i < 129; ++i) {
    const auto cls = [](char ch) { return ch == ' ' ? 's' : ch == '+' || ch == '-' ? 'p' : ch == '\n' ? 'n' : ch == '.' ? '.' : 'x'; };
    if (i >= 27) {
      EXPECT_EQ(cls(my_rec[i]), cls(real_rec[i])) << "column " << i;
    }
  }
}

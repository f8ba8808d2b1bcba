// Orbit model and DOR_VOR writer of the simulator.
#include <gtest/gtest.h>

#include <cmath>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <string>

#include "header_shape.hpp"
#include "base/convert.hpp"
#include "envisat/product_types.hpp"
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

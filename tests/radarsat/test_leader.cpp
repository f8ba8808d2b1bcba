// CEOS leaders: the real RADARSAT-1 leader read by the record walk, simulated leaders turned
// into Earth-fixed orbits, and broken leaders refused with the file named.
#include <gtest/gtest.h>

#include <filesystem>
#include <fstream>
#include <unistd.h>

#include "geometry/orbit_interp.hpp"
#include "radarsat/ceos_leader.hpp"
#include "simulator/orbit_model.hpp"
#include "simulator/rsat_product.hpp"

namespace fs = std::filesystem;
using namespace sar::radarsat;
namespace sim = sar::simulator;

namespace {

const std::string kRealLeader = std::string(SAR_REAL_DATA_DIR) + "/RADARSAT1_CEOS/R105291246P4S029.L";

std::string slurp(const std::string& path) {
  std::ifstream in(path, std::ios::binary);
  return {std::istreambuf_iterator<char>(in), {}};
}

fs::path temp_dir(const std::string& name) {
  const fs::path d = fs::temp_directory_path() / ("rsat_leader_" + name + "_" + std::to_string(::getpid()));
  fs::remove_all(d);
  fs::create_directories(d);
  return d;
}

sim::OrbitModel scene_orbit() {
  return sim::OrbitModel::for_scene({45.0, 10.0, 0.0}, 530000000.0, 38.0, false, 30000);
}

}  // namespace

TEST(RealLeader, RecordWalkFindsTheSummaryAndThePlatformPosition) {
  const Leader l = read_leader(kRealLeader);
  ASSERT_EQ(l.records.size(), 11u);
  EXPECT_EQ(l.records[1].type_code(), record_code::kDataSetSummary);
  EXPECT_EQ(l.records[3].offset, 6436);  // not where a fixed-offset reader would look
  EXPECT_EQ(l.dss.orbit_configuration, "DESCENDING");
  EXPECT_EQ(l.dss.orbit_number, "00005291");
  EXPECT_EQ(l.dss.scene_id, "R105291246P4S029");
  EXPECT_FALSE(l.is_slc());

  const PlatformPosition& p = l.ppr;
  EXPECT_EQ(p.offset, 6436);
  EXPECT_EQ(p.count, 3);
  EXPECT_EQ(p.year, 1996);
  EXPECT_EQ(p.month, 11);
  EXPECT_EQ(p.day, 8);
  EXPECT_EQ(p.day_of_year, 313);
  EXPECT_DOUBLE_EQ(p.seconds_of_day, 67223.71875);
  EXPECT_NEAR(p.interval, 37.7299, 1e-4);
  EXPECT_NEAR(p.gha_deg, 47.4632, 1e-4);
  EXPECT_TRUE(p.inertial());
  ASSERT_EQ(p.positions.size(), 3u);
  EXPECT_DOUBLE_EQ(p.positions[0][0], -956.6641845703125);
  EXPECT_DOUBLE_EQ(p.positions[0][1], -911.8516845703125);
  EXPECT_DOUBLE_EQ(p.positions[0][2], 7038.61328125);
  EXPECT_DOUBLE_EQ(p.velocities[0][0], -7282.28369140625);
  EXPECT_DOUBLE_EQ(p.velocities[0][1], 1395.884033203125);
  EXPECT_DOUBLE_EQ(p.velocities[0][2], -807.439697265625);
  // 8 Nov 1996 is day 4329 after 1 Jan 1985.
  EXPECT_DOUBLE_EQ(p.first_time(), 4329 * 86400.0 + 67223.71875);
}

TEST(RealLeader, ThreeVectorsAreTooFewForAnOrbit) {
  const Leader l = read_leader(kRealLeader);
  try {
    leader_orbit(l);
    FAIL() << "three vectors accepted";
  } catch (const CeosError& e) {
    EXPECT_NE(std::string(e.what()).find("There are less than 3 state vectors in the leader file!"), std::string::npos);
    EXPECT_NE(std::string(e.what()).find(kRealLeader), std::string::npos);
    EXPECT_EQ(e.status(), 1);
  }
}

TEST(SimulatedLeader, InertialVectorsComeBackEarthFixedInAnyUnits) {
  const sim::OrbitModel orbit = scene_orbit();
  const double first = 530000000.0 - 300.0;
  struct Case {
    const char* name;
    double positionScale, velocityScale;  // applied to km and m/s
    std::string frame;
  };
  const Case cases[] = {{"km and m/s", 1.0, 1.0, "GEOCENTRIC EQUATORIAL INERTIAL"},
                        {"m and mm/s", 1000.0, 1000.0, "GEOCENTRIC EQUATORIAL INERTIAL"},
                        {"km and mm/s", 1.0, 1000.0, "GEOCENTRIC EQUATORIAL INERTIAL"}};
  const fs::path dir = temp_dir("units");
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    sim::rsat::LeaderContent content = sim::rsat::leader_from_orbit(orbit, first, 21, 30.0, 201.5);
    content.frame = c.frame;
    for (auto& p : content.positions) p = p * c.positionScale;
    for (auto& v : content.velocities) v = v * c.velocityScale;
    const std::string path = (dir / "lea_01.001").string();
    sim::rsat::write_leader(path, content);
    const auto data = leader_orbit(read_leader(path));
    ASSERT_EQ(data.vectors.size(), 21u);
    EXPECT_NEAR(data.vectors.front().time, first, 1e-6);
    // Between the records too: the interpolated orbit follows the model.
    for (double dt : {0.0, 95.0, 301.3, 588.0}) {
      const auto sv = sar::geometry::orbit_state_at(data, first + dt);
      const sim::StateVector truth = orbit.state(first + dt);
      EXPECT_NEAR(sv.position[0], truth.position.x, 0.05);
      EXPECT_NEAR(sv.position[1], truth.position.y, 0.05);
      EXPECT_NEAR(sv.position[2], truth.position.z, 0.05);
      // The velocity is the derivative of the fitted positions: millimetres a second.
      EXPECT_NEAR(sv.velocity[0], truth.velocity.x, 5e-3);
      EXPECT_NEAR(sv.velocity[1], truth.velocity.y, 5e-3);
      EXPECT_NEAR(sv.velocity[2], truth.velocity.z, 5e-3);
    }
  }
  fs::remove_all(dir);
}

TEST(BrokenLeader, RefusedWithTheFileNamed) {
  const std::string real = slurp(kRealLeader);
  ASSERT_EQ(real.size(), 30429u);
  struct Case {
    const char* name;
    std::string bytes;
    const char* words;
  };
  std::string otherSatellite = real;
  otherSatellite.replace(720 + 396, 2, "E2");
  otherSatellite.replace(720 + 412, 6, "ERS-2 ");
  std::string noCeos = real;
  noCeos.replace(16, 3, "XYZ");
  std::string badLength = real;
  badLength[720 + 8] = 0x7F;  // DSS length far beyond the file
  std::string tinyLength = real;
  tinyLength[4816 + 10] = 0;
  tinyLength[4816 + 11] = 4;  // a record of 4 bytes
  std::string noPpr = real;
  noPpr[6436 + 5] = 0x1F;  // type code 31 instead of 30
  std::string badNumber = real;
  badNumber.replace(6436 + 268, 4, "  x7");
  const Case cases[] = {
      {"another satellite", otherSatellite, "another satellite"},
      {"not CEOS", noCeos, "not a CEOS file"},
      {"truncated", real.substr(0, 20000), "runs past the end"},
      {"record length beyond the file", badLength, "runs past the end"},
      {"record length below a header", tinyLength, "below 12"},
      {"no platform position", noPpr, "no platform position record"},
      {"bad GHA", badNumber, "Greenwich hour angle"},
      {"empty", std::string(), "not a CEOS file"},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    try {
      parse_leader(c.bytes, "lea_01.001");
      FAIL() << "accepted";
    } catch (const CeosError& e) {
      EXPECT_NE(std::string(e.what()).find(c.words), std::string::npos) << e.what();
      EXPECT_EQ(std::string(e.what()).rfind("lea_01.001: ", 0), 0u) << e.what();
    }
  }
  try {
    read_leader("/nonexistent/lea_01.001");
    FAIL() << "missing leader accepted";
  } catch (const CeosError& e) {
    EXPECT_NE(std::string(e.what()).find("/nonexistent/lea_01.001: leader file not found"), std::string::npos);
  }
}

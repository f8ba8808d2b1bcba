// Attitude of the simulated satellite, and the orbit-and-attitude Doppler prediction of the
// geometry library checked against it on products written by the simulator.
#include <gtest/gtest.h>

#include <cmath>
#include <filesystem>
#include <fstream>
#include <string>
#include <vector>

#include "base/convert.hpp"
#include "geometry/doppler_geometry.hpp"
#include "geometry/orbit_file.hpp"
#include "simulator/attitude.hpp"
#include "simulator/orbit_file.hpp"
#include "simulator/orbit_model.hpp"
#include "simulator/simulator.hpp"

namespace sim = sar::simulator;
namespace geo = sar::geometry;

namespace {

const double kScene = sar::base::ascii2sec85("02-MAR-2008 10:00:00.000000");
const double kWavelength = sim::kSpeedOfLight / 5.331004416e9;
constexpr double kDeg = sim::kPi / 180.0;

struct Pass {
  const char* name;
  double lat;
  bool ascending;
  double u_low, u_high;  // degrees: the quadrant of the argument of latitude
};

// Ascending north, descending north, descending south, ascending south.
constexpr Pass kPasses[] = {{"ascending north", 40.0, true, 0.0, 90.0},
                            {"descending north", 40.0, false, 90.0, 180.0},
                            {"descending south", -40.0, false, 180.0, 270.0},
                            {"ascending south", -40.0, true, 270.0, 360.0}};

sim::OrbitModel orbit_for(const Pass& pass) {
  return sim::OrbitModel::for_scene({pass.lat, 10.0, 0.0}, kScene, 23.0, pass.ascending, 31400);
}

// Two-way time of the scene target at zero Doppler.
double scene_tau(const sim::OrbitModel& orbit, const Pass& pass) {
  const sim::Vec3 p = sim::geodetic_to_ecef({pass.lat, 10.0, 0.0});
  return 2.0 * (p - orbit.state(kScene).position).norm() / sim::kSpeedOfLight;
}

std::string write_orbit(const sim::OrbitModel& orbit, const std::string& name) {
  const std::string dir = std::string(SAR_BINARY_DIR) + "/test_tools_attitude/" + name;
  std::filesystem::remove_all(dir);
  std::filesystem::create_directories(dir);
  sim::OrbitFileRequest request;
  request.start = std::floor((kScene - 7200.0) / 60.0) * 60.0;
  request.stop = std::ceil((kScene + 7200.0) / 60.0) * 60.0;
  return sim::write_orbit_file(orbit, request, dir);
}

}  // namespace

TEST(DopplerPrediction, MatchesTheSimulatorInAllFourQuadrants) {
  int index = 0;
  for (const Pass& pass : kPasses) {
    SCOPED_TRACE(pass.name);
    const sim::OrbitModel orbit = orbit_for(pass);
    const double u = sim::argument_of_latitude(orbit, kScene) / kDeg;
    EXPECT_GT(u, pass.u_low);
    EXPECT_LT(u, pass.u_high);
    std::string name = "quadrant";
    name += std::to_string(index++);
    const std::string path = write_orbit(orbit, name);
    const geo::OrbitData data = geo::read_orbit(path);
    const double tau = scene_tau(orbit, pass);
    for (const double wanted : {0.0, 700.0, -450.0}) {
      sim::Attitude att;  // yaw steering on
      if (wanted != 0.0) att.squint_rad = sim::squint_for_centroid(orbit, att, kScene, tau, kWavelength, wanted);
      const double truth = sim::beam_centre_doppler(orbit, att, kScene, tau, kWavelength);
      const double truth_rate = sim::beam_centre_doppler_rate(orbit, att, kScene, tau, kWavelength);
      if (wanted != 0.0) {
        EXPECT_NEAR(truth, wanted, 1e-3);
      }
      geo::DopplerPrediction prediction;
      geo::PointingLaw law;
      law.a_rad = att.squint_rad;
      ASSERT_EQ(geo::predict_doppler(data, kScene, tau, kWavelength, law, prediction), 0);
      // The argument of latitude is read against the node's position at the node time; the
      // node has drifted since by up to 1e-3 rad, which tilts u by up to 2e-4 rad (0.7 Hz).
      EXPECT_NEAR(std::remainder(prediction.argument_of_latitude - u * kDeg, 2.0 * sim::kPi), 0.0, 2.5e-4);
      EXPECT_NEAR(prediction.fdc, truth, 1.0);
      EXPECT_NEAR(prediction.rate / truth_rate, 1.0, 1e-3);
      double fdc = 0.0;
      ASSERT_EQ(geo::EstDopplerENVI(path, kScene, tau, 1.0, 10.0, kWavelength, law.p_deg, law.q_deg, law.r_deg,
                                    law.s_deg, law.a_rad, fdc),
                0);
      EXPECT_EQ(fdc, prediction.fdc);
    }
  }
}

TEST(Attitude, ZeroDopplerSteeringKeepsTheBeamOnTheZeroDopplerPlane) {
  const Pass& pass = kPasses[1];
  const sim::OrbitModel orbit = orbit_for(pass);
  sim::Attitude att;
  att.yaw_steering = false;
  const sim::Vec3 target = sim::geodetic_to_ecef({pass.lat, 10.0, 0.0});
  EXPECT_NEAR(sim::azimuth_off_boresight(orbit, att, kScene, target), 0.0, 1e-9);
  EXPECT_NEAR(sim::beam_centre_time(orbit, att, target, kScene + 3.0), kScene, 1e-6);
  for (const double tau : {5.4e-3, 5.7e-3, 6.0e-3})
    EXPECT_NEAR(sim::beam_centre_doppler(orbit, att, kScene, tau, kWavelength), 0.0, 1e-6);
  // A squint s looks forward: the centroid becomes 2 V sin(s) / lambda.
  att.squint_rad = 0.003;
  const double speed = orbit.state(kScene).velocity.norm();
  EXPECT_NEAR(sim::beam_centre_doppler(orbit, att, kScene, 5.7e-3, kWavelength), 2.0 * speed * std::sin(0.003) / kWavelength,
              1e-6);
}

// The yaw of the law turns the beam against the Earth's rotation: without it an unsteered beam
// sees kilohertz of centroid at the equator, with it the centroid stays near zero all round the
// orbit (the pitch and roll terms, which answer the ellipsoid, are left out of this check).
TEST(Attitude, YawSteeringCompensatesTheEarthRotation) {
  // Yaw alone answers the Earth's rotation; the radius change of a real orbit is the pitch
  // term's job, so this check flies a circular orbit.
  sim::OrbitElements elements = orbit_for(kPasses[0]).elements();
  elements.radius_dip = 0.0;
  const sim::OrbitModel orbit(elements);
  sim::Attitude yaw_only;
  yaw_only.q_deg = 0.0;
  yaw_only.r_deg = 0.0;
  sim::Attitude unsteered = yaw_only;
  unsteered.p_deg = 0.0;
  for (double k = 0.0; k < 8.0; k += 1.0) {
    const double t = kScene + k * orbit.period() / 8.0;
    const double u = sim::argument_of_latitude(orbit, t);
    SCOPED_TRACE(u / kDeg);
    EXPECT_LT(std::fabs(sim::beam_centre_doppler(orbit, yaw_only, t, 5.7e-3, kWavelength)), 40.0);
    const double raw = sim::beam_centre_doppler(orbit, unsteered, t, 5.7e-3, kWavelength);
    EXPECT_GT(std::fabs(raw), 1500.0 * std::fabs(std::cos(u)));
    const sim::AttitudeAngles a = sim::attitude_angles(orbit, yaw_only, t);
    EXPECT_NEAR(a.yaw, 3.912987 * kDeg * std::cos(u), 2e-4);
    EXPECT_EQ(a.pitch, 0.0);
  }
}

TEST(Attitude, BeamCentreGeometryAndRate) {
  const Pass& pass = kPasses[2];
  const sim::OrbitModel orbit = orbit_for(pass);
  sim::Attitude att;
  const double tau = scene_tau(orbit, pass);
  att.squint_rad = sim::squint_for_centroid(orbit, att, kScene, tau, kWavelength, 1234.5);
  const sim::Vec3 x = sim::beam_centre_point(orbit, att, kScene, tau);
  const sim::StateVector s = orbit.state(kScene);
  EXPECT_NEAR((x - s.position).norm(), 0.5 * sim::kSpeedOfLight * tau, 1e-6);
  EXPECT_NEAR(sim::ecef_to_geodetic(x).height, 0.0, 1e-3);
  EXPECT_NEAR(sim::azimuth_off_boresight(orbit, att, kScene, x), 0.0, 1e-12);
  // Right of the track.
  EXPECT_GT((x - s.position).dot(s.velocity.cross(s.position)), 0.0);
  EXPECT_NEAR(sim::target_doppler(orbit, kScene, x, kWavelength), 1234.5, 1e-4);
  // The target crosses the beam centre at kScene, and the rate there is about -2 V^2 / (lambda R).
  EXPECT_NEAR(sim::beam_centre_time(orbit, att, x, kScene + 2.0), kScene, 1e-6);
  const double rate = sim::beam_centre_doppler_rate(orbit, att, kScene, tau, kWavelength);
  EXPECT_NEAR(rate, sim::target_doppler_rate(orbit, kScene, x, kWavelength), 1e-9);
  const double later = kScene + 0.01, earlier = kScene - 0.01;  // sec85 rounds the step: divide by the true one
  const double slope = (sim::target_doppler(orbit, later, x, kWavelength) -
                        sim::target_doppler(orbit, earlier, x, kWavelength)) / (later - earlier);
  EXPECT_NEAR(rate, slope, 1e-3);
  EXPECT_NEAR(rate, -2100.0, 100.0);
  EXPECT_THROW(sim::beam_centre_point(orbit, att, kScene, 4.0e-3), std::runtime_error);  // shorter than the altitude
  EXPECT_THROW(sim::squint_for_centroid(orbit, att, kScene, tau, kWavelength, 1e6), std::runtime_error);
}

namespace {

std::string truth_value(const std::string& path, const std::string& section, const std::string& key) {
  std::ifstream in(path);
  std::string line, current;
  while (std::getline(in, line)) {
    if (!line.empty() && line[0] == '[') current = line.substr(1, line.find(']') - 1);
    else if (current == section && line.rfind(key + " = ", 0) == 0) return line.substr(key.size() + 3);
  }
  return {};
}

}  // namespace

// A yaw-steered product squinted to a wanted centroid: the truth, the echoes and the orbit file
// agree, and the centroid entry of the IM job reproduces the centroid from the orbit file when
// called with the scene centre (first line time + lines / (2 PRF), mid-swath two-way time).
TEST(Attitude, SquintedProductCarriesItsCentroid) {
  sim::SimulationConfig c;
  c.out_dir = std::string(SAR_BINARY_DIR) + "/test_tools_attitude/product";
  std::filesystem::remove_all(c.out_dir);
  c.lines = 1600;
  c.samples = 256;
  c.noise_db = -200.0;
  c.keep_echoes = true;
  c.targets = {{{-30.0, 20.0, 0.0}, 30.0}};
  c.attitude.yaw_steering = true;
  c.centroid_hz = 420.0;
  const sim::SimulationTruth t = sim::run_simulation(c);

  EXPECT_NEAR(t.doppler_centroid, 420.0, 1e-3);
  EXPECT_TRUE(t.attitude.yaw_steering);
  EXPECT_NE(t.attitude.squint_rad, 0.0);
  EXPECT_NEAR(std::stod(truth_value(t.truth_path, "acquisition", "doppler_centroid")), 420.0, 1e-3);
  EXPECT_EQ(truth_value(t.truth_path, "acquisition", "yaw_steering"), "1");
  const sim::TargetTruth& tt = t.targets.front();
  EXPECT_NEAR(tt.doppler_centroid, 420.0, 2.0);
  EXPECT_NEAR(std::stod(truth_value(t.truth_path, "target_1", "doppler_centroid")), tt.doppler_centroid, 1e-3);
  // The target crosses the beam centre at the middle line, fdc / rate from its zero Doppler.
  EXPECT_NEAR((tt.beam_centre_time - t.first_line_time) * t.prf, 0.5 * c.lines, 0.5);
  EXPECT_NEAR(tt.beam_centre_time - tt.zero_doppler_time, tt.doppler_centroid / tt.doppler_rate, 2e-3);
  // The echo is strongest at the beam-centre crossing, not at zero Doppler.
  std::vector<double> power(static_cast<std::size_t>(c.lines), 0.0);
  for (std::size_t l = 0; l < power.size(); ++l)
    for (std::size_t k = 0; k < static_cast<std::size_t>(c.samples); ++k)
      power[l] += std::norm(t.echoes[l * static_cast<std::size_t>(c.samples) + k]);
  std::size_t peak = 0;
  for (std::size_t l = 0; l < power.size(); ++l)
    if (power[l] > power[peak]) peak = l;
  EXPECT_NEAR(static_cast<double>(peak), 0.5 * c.lines, 3.0);
  EXPECT_GT(std::fabs(tt.azimuth_line - 0.5 * c.lines), 50.0);

  const double t_mid = t.first_line_time + c.lines / (2.0 * t.prf);
  const double tau_mid = t.near_range_time + 0.5 * c.samples / c.im.sampling_frequency;
  double fdc = 0.0;
  ASSERT_EQ(geo::EstDopplerENVI(t.orbit_path, t_mid, tau_mid, 1.0, 10.0, t.wavelength, 3.912987, -0.167074, 0.050233,
                                23.0, t.attitude.squint_rad, fdc),
            0);
  EXPECT_NEAR(fdc, t.doppler_centroid, 1.0);
  // A range time in place of the azimuth time lies outside any orbit.
  EXPECT_EQ(geo::EstDopplerENVI(t.orbit_path, tau_mid, t.near_range_time, 1.0, 10.0, t.wavelength, 3.912987,
                                -0.167074, 0.050233, 23.0, 0.0, fdc),
            13);
}

TEST(Attitude, ZeroDopplerProductIsUnchanged) {
  sim::SimulationConfig c;
  c.out_dir = std::string(SAR_BINARY_DIR) + "/test_tools_attitude/plain";
  std::filesystem::remove_all(c.out_dir);
  c.lines = 400;
  c.samples = 128;
  c.targets = {{{45.0, 10.0, 0.0}, 30.0}};
  const sim::SimulationTruth t = sim::run_simulation(c);
  EXPECT_FALSE(t.attitude.yaw_steering);
  EXPECT_EQ(t.doppler_centroid, 0.0);
  EXPECT_EQ(t.targets.front().beam_centre_time, t.targets.front().zero_doppler_time);
  EXPECT_NEAR(t.targets.front().azimuth_line, 0.5 * c.lines, 0.5);
  EXPECT_EQ(truth_value(t.truth_path, "acquisition", "doppler_centroid"), "0.000");
}

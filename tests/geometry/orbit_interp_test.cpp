// Orbit interpolation against the real DORIS products and a closed-form orbit.
#include <gtest/gtest.h>

#include <cmath>

#include "geometry/orbit_interp.hpp"
#include "synthetic_orbit.hpp"

namespace sar::geometry {
namespace {

using testing::kPor;
using testing::kVor;
using testing::real_file;

class RealOrbit : public ::testing::TestWithParam<const char*> {};

TEST_P(RealOrbit, VelocityIsTheDerivativeOfPosition) {
  // Positions and velocities are interpolated separately; a wrong time scale, window or node
  // weight shows as a disagreement. Central differences over +-0.5 s have a truncation error
  // of h^2/6 * |jerk| (about 1e-6 m/s) and a rounding error of 1e-9 m / 1 s.
  const OrbitData d = read_orbit(real_file(GetParam()));
  const double h = 0.5;
  double worst = 0.0;
  for (double t = d.sensing_start + h; t <= d.sensing_stop - h; t += 23.7) {
    const OrbitSamples s = interpolate_orbit(d, t, {3, h, true, false});
    const Vec3 fd = (1.0 / (2.0 * h)) * (s.positions[2] - s.positions[0]);
    worst = std::max(worst, norm(fd - s.velocities[1]));
  }
  EXPECT_LT(worst, 1e-3) << "m/s";
  RecordProperty("worst_velocity_mismatch_mm_s", std::to_string(worst * 1e3));
}

TEST_P(RealOrbit, HeldOutRecordIsPredicted) {
  // The eight neighbours of a record predict it within 1 m: DORIS positions are smooth at
  // the millimetre level, and eighth-degree Lagrange over 60 s steps leaves centimetres.
  const OrbitData d = read_orbit(real_file(GetParam()));
  double worst = 0.0, worstVel = 0.0;
  for (std::size_t k = 4; k + 4 < d.vectors.size(); ++k) {
    std::vector<double> t;
    std::vector<Vec3> p, v;
    for (std::size_t j = k - 4; j <= k + 4; ++j) {
      if (j == k) continue;
      t.push_back(d.vectors[j].time - d.vectors[k].time);
      p.push_back(d.vectors[j].position);
      v.push_back(d.vectors[j].velocity);
    }
    worst = std::max(worst, norm(lagrange_interpolate(t, p, 0.0) - d.vectors[k].position));
    worstVel = std::max(worstVel, norm(lagrange_interpolate(t, v, 0.0) - d.vectors[k].velocity));
  }
  EXPECT_LT(worst, 1.0) << "m";
  EXPECT_LT(worstVel, 1e-3) << "m/s";
}

TEST_P(RealOrbit, EndsAndOutside) {
  const OrbitData d = read_orbit(real_file(GetParam()));
  struct Case {
    const char* name;
    double t;
    int count;
    double step;
    int status;  // 0: accepted
  };
  const double start = d.sensing_start, stop = d.sensing_stop;
  const Case cases[] = {
      {"sensing start", start, 1, 0.0, 0},
      {"sensing stop", stop, 1, 0.0, 0},
      {"one tick before the start", std::nextafter(start, 0.0), 1, 0.0, orbit_status::kOutsideSpan},
      {"one tick after the stop", std::nextafter(stop, 1e12), 1, 0.0, orbit_status::kOutsideSpan},
      {"an hour after the stop", stop + 3600.0, 1, 0.0, orbit_status::kOutsideSpan},
      {"samples spill over the start", start + 5.0, 5, 5.0, orbit_status::kOutsideSpan},
      {"samples just inside the stop", stop - 10.0, 5, 5.0, 0},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    try {
      const OrbitSamples s = interpolate_orbit(d, c.t, {c.count, c.step, true, false});
      EXPECT_EQ(c.status, 0);
    } catch (const OrbitError& e) {
      EXPECT_EQ(e.status(), c.status) << e.what();
    }
  }
  // At the ends the nine-point window is clamped; the end records come back unchanged.
  const StateVector first = orbit_state_at(d, start), last = orbit_state_at(d, stop);
  EXPECT_EQ(first.position, d.vectors.front().position);
  EXPECT_EQ(first.velocity, d.vectors.front().velocity);
  EXPECT_EQ(last.position, d.vectors.back().position);
  EXPECT_EQ(last.velocity, d.vectors.back().velocity);
}

INSTANTIATE_TEST_SUITE_P(Doris, RealOrbit, ::testing::Values(kVor, kPor));

TEST(OrbitInterp, QueryOnEpochAndOrbitNumber) {
  const OrbitData d = read_orbit(real_file(kVor));
  const StateVector mid = orbit_state_at(d, d.vectors[700].time);
  EXPECT_EQ(mid.position, d.vectors[700].position);
  // The orbit number is the nearer record's: find the record where it changes.
  std::size_t change = 1;
  while (d.vectors[change].orbit_number == d.vectors[change - 1].orbit_number) ++change;
  const double tb = d.vectors[change - 1].time, ta = d.vectors[change].time;
  EXPECT_EQ(interpolate_orbit(d, tb + 20.0).orbit_number, d.vectors[change - 1].orbit_number);
  EXPECT_EQ(interpolate_orbit(d, ta - 20.0).orbit_number, d.vectors[change].orbit_number);
}

TEST(OrbitInterp, AscendingNode) {
  const OrbitData d = read_orbit(real_file(kVor));
  // The file opens at Z < 0 going north: no crossing is seen in its first minute.
  try {
    interpolate_orbit(d, d.sensing_start + 30.0, {1, 0.0, false, true});
    ADD_FAILURE();
  } catch (const OrbitError& e) {
    EXPECT_EQ(e.status(), orbit_status::kNoNodeOrHeader);
    EXPECT_STREQ(e.what(), "Cannot compute ascending node time: no change in orbit number");
  }
  // Without the node flag the same time is fine.
  EXPECT_NO_THROW(interpolate_orbit(d, d.sensing_start + 30.0));
  const double t = d.sensing_start + 40000.0;
  const double node = interpolate_orbit(d, t, {1, 0.0, false, true}).node_time;
  const StateVector atNode = orbit_state_at(d, node);
  EXPECT_NEAR(atNode.position[2], 0.0, 0.1);  // 1e-5 s bisection at 7 km/s: under a decimetre
  EXPECT_GT(atNode.velocity[2], 0.0);
  EXPECT_LT(node, t);
  EXPECT_GT(node, t - 6100.0);  // the last crossing, within one revolution
}

TEST(OrbitInterp, StatusEntryPoints) {
  const std::string vor = real_file(kVor);
  const OrbitData d = read_orbit(vor);
  const double t = d.sensing_start + 5000.0;
  std::vector<double> p(15), v(15);
  int orbit = 0;
  double node = -1.0;
  ASSERT_EQ(interp_orb_l(vor, t, 5, 5.0, p, v, &orbit, 1, &node), 0);
  const OrbitSamples s = interpolate_orbit(d, t, {5, 5.0, true, true});
  for (std::size_t i = 0; i < 5; ++i)
    for (std::size_t a = 0; a < 3; ++a) {
      EXPECT_EQ(p[3 * i + a], s.positions[i][a]);
      EXPECT_EQ(v[3 * i + a], s.velocities[i][a]);
    }
  EXPECT_EQ(node, s.node_time);
  EXPECT_EQ(interp_orb_l(vor, d.sensing_stop + 1.0, 1, 0.0, p, {}, nullptr, 0, nullptr), orbit_status::kOutsideSpan);
  EXPECT_EQ(interp_orb_l(real_file("ASA_XCA_AX/ASA_XCA_AXVIEC20070517_153558_20070204_165113_20071231_000000"), t, 1,
                         0.0, p, {}, nullptr, 0, nullptr),
            orbit_status::kNotOrbitProduct);
  // Raw records from the one before the first epoch not below t.
  std::vector<double> ep(5);
  ASSERT_EQ(get_state_vectors(vor, d.vectors[10].time + 1.0, 5, p, v, ep), 0);
  EXPECT_EQ(ep[0], d.vectors[10].time);
  EXPECT_EQ(p[3], d.vectors[11].position[0]);
  EXPECT_EQ(get_state_vectors(vor, d.vectors[1586].time + 1.0, 5, p, v, ep), 3);  // the file ends first
}

TEST(OrbitInterp, ClosedFormOrbitBothFamilies) {
  // Nine-point Lagrange (60 s steps) reproduces a circular orbit to millimetres; the text
  // family's degree 4 through five records leaves r (n h)^5 / 5! * max|prod(s - k)| ~ 0.3 m in
  // position, and its velocity, the derivative of that polynomial, a few cm/s.
  testing::CircularOrbit orbit;
  const OrbitData nine = orbit.table(0.0, 60.0, 40);
  OrbitData five = nine;
  five.family = OrbitFamily::kTextOrbit;
  struct Case {
    const OrbitData* d;
    double pos_m, vel_m_s;
  };
  for (const Case& c : {Case{&nine, 2e-3, 1e-5}, Case{&five, 0.5, 0.05}}) {
    double worstP = 0.0, worstV = 0.0;
    for (double t = nine.sensing_start; t <= nine.sensing_stop; t += 7.3) {
      const StateVector got = orbit_state_at(*c.d, t), truth = orbit.earth_fixed(t);
      worstP = std::max(worstP, norm(got.position - truth.position));
      worstV = std::max(worstV, norm(got.velocity - truth.velocity));
    }
    EXPECT_LT(worstP, c.pos_m);
    EXPECT_LT(worstV, c.vel_m_s);
  }
}

}  // namespace
}  // namespace sar::geometry

// Orbit sampling over the scene, elevation pattern and nominal replica, checked against the
// real orbit and auxiliary files and against the chirp's own physics.
#include <gtest/gtest.h>

#include <cmath>
#include <complex>
#include <fstream>
#include <algorithm>
#include <cstring>
#include <numbers>

#include "base/errors.hpp"
#include "base/convert.hpp"
#include "envisat/replica_pattern.hpp"

using namespace sar::envisat;

namespace {

const std::string kReal = SAR_REAL_DATA_DIR;
const std::string kVor = kReal + "/DOR_VOR_AX/DOR_VOR_AXVF-P20080331_075200_20080301_215527_20080303_002327";
const std::string kIns = kReal + "/ASA_INS_AX/ASA_INS_AXVIEC20101222_143805_20101022_000000_20141231_235959";
const std::string kXca = kReal + "/ASA_XCA_AX/ASA_XCA_AXVIEC20101111_113830_20100601_000000_20141231_000000";

// Big-endian float at a file position, decoded here independently of the readers.
float be_float_at(const std::string& path, std::streamoff pos) {
  std::ifstream in(path, std::ios::binary);
  in.seekg(pos);
  unsigned char b[4] = {};
  in.read(reinterpret_cast<char*>(b), 4);
  const uint32_t u = (uint32_t{b[0]} << 24) | (uint32_t{b[1]} << 16) | (uint32_t{b[2]} << 8) | b[3];
  float f;
  std::memcpy(&f, &u, 4);
  return f;
}

}  // namespace

TEST(Replica, CentredScaledChirpSweepsTheBandwidth) {
  struct Case {
    double fs, tau, bandwidth;
    int resampling;
    long n;
  };
  for (Case c : {Case{19207680.0, 27.1e-6, 16e6, 1, 521}, Case{19207680.0, 27.1e-6 + 1 / 19207680.0, 16e6, 1, 522},
                 Case{19207680.0, 40e-6, 8e6, 2, 384}}) {
    sarpar par;
    par.samplingRate = c.fs;
    par.pulse_length = c.tau;
    par.chirp_bandwidth = c.bandwidth;
    par.resampling_factor = c.resampling;
    sar::metadata::SceneReferences proc;
    ASSERT_EQ(envi_syntchirp(par, proc), 0);
    ASSERT_EQ(proc.replicaLength, c.n);
    ASSERT_EQ(proc.replica.size(), static_cast<std::size_t>(c.n));
    const float amp = static_cast<float>(c.bandwidth / c.n);
    const auto& r = proc.replica;
    for (std::size_t i = 0; i < r.size(); ++i) {
      ASSERT_NEAR(std::abs(r[i]), amp, amp * 1e-5) << i;
      ASSERT_NEAR(std::abs(r[i] - r[r.size() - 1 - i]), 0.0, amp * 1e-4) << "not symmetric at " << i;
    }
    if (c.n % 2 == 1) {
      EXPECT_FLOAT_EQ(r[r.size() / 2].real(), amp);  // zero phase in the middle
      EXPECT_FLOAT_EQ(r[r.size() / 2].imag(), 0.0f);
    }
    // The instantaneous frequency at the last sample is close to +B/2 (up-chirp).
    const double fs = c.fs / c.resampling;
    const double dphi = std::arg(r[r.size() - 1] * std::conj(r[r.size() - 2]));
    const double fEnd = dphi / (2 * std::numbers::pi) * fs;
    EXPECT_NEAR(fEnd, c.bandwidth / 2, c.bandwidth * 0.01);
  }
  // One sample: the bandwidth itself.
  sarpar one;
  one.samplingRate = 1.0;
  one.pulse_length = 1.0;
  one.chirp_bandwidth = 5.0;
  sar::metadata::SceneReferences proc;
  ASSERT_EQ(envi_syntchirp(one, proc), 0);
  ASSERT_EQ(proc.replicaLength, 1);
  EXPECT_FLOAT_EQ(proc.replica[0].real(), 5.0f);
  one.pulse_length = 0.0;
  EXPECT_NE(envi_syntchirp(one, proc), 0);
}

TEST(ElevationPattern, LinearAmplitudeAroundTheInsReferenceAngle) {
  for (int beam : {1, 2, 6, 7}) {
    sarpar par;
    par.swath_number = beam;
    par.polarization_type = 0;
    sar::metadata::SceneReferences proc;
    ASSERT_EQ(envi_rgpattern(kXca, kIns, par, proc), 0);
    ASSERT_EQ(proc.patternLength, 201);
    ASSERT_EQ(proc.pattern.size(), 201u);
    EXPECT_DOUBLE_EQ(proc.patternStep, 0.05);
    // Centre: the ASA_INS float at record byte 161916 + 4 b, the record following the
    // 1247-byte MPH and the 378-byte SPH.
    EXPECT_FLOAT_EQ(static_cast<float>(proc.patternCentre), be_float_at(kIns, 1625 + 161916 + 4 * beam)) << beam;
    EXPECT_GT(proc.patternCentre, 10.0);
    EXPECT_LT(proc.patternCentre, 50.0);
    // Entry k is 10^(g/20) of the XCA's dB value at record byte 4 (201 (4 b + p) + k) - 2424.
    for (int k : {0, 100, 200}) {
      const float g = be_float_at(kXca, 1625 + 4 * (201 * (4 * beam) + k) - 2424);
      EXPECT_NEAR(proc.pattern[static_cast<std::size_t>(k)], std::pow(10.0, g / 20.0), 1e-5) << beam << " " << k;
    }
    // A beam pattern peaks inside its table and falls off towards both ends.
    const auto peak = std::max_element(proc.pattern.begin(), proc.pattern.end()) - proc.pattern.begin();
    EXPECT_GT(peak, 20);
    EXPECT_LT(peak, 180);
    EXPECT_LT(proc.pattern.front(), proc.pattern[static_cast<std::size_t>(peak)]);
    EXPECT_LT(proc.pattern.back(), proc.pattern[static_cast<std::size_t>(peak)]);
  }
}

TEST(SceneOrbit, FiveStateVectorsCentredOnTheScene) {
  sarpar par;
  par.azimuthStartTime = sar::base::ascii2sec85("02-MAR-2008 10:00:00.000000");
  par.prf = 1652.0;
  par.lines = 30000;
  sar::metadata::SceneReferences proc;
  ASSERT_EQ(envi_orbit(kVor, par, proc), 0);
  const double duration = par.lines / par.prf;
  EXPECT_DOUBLE_EQ(proc.orbitSpacing, duration / 3);
  EXPECT_DOUBLE_EQ(proc.orbitStartTime, par.azimuthStartTime - duration / 6);
  for (int i = 0; i < 5; ++i) {
    const double* p = &proc.orbitPositions[static_cast<std::size_t>(3 * i)];
    const double* v = &proc.orbitVelocities[static_cast<std::size_t>(3 * i)];
    const double r = std::sqrt(p[0] * p[0] + p[1] * p[1] + p[2] * p[2]);
    const double speed = std::sqrt(v[0] * v[0] + v[1] * v[1] + v[2] * v[2]);
    EXPECT_NEAR(r, 7.16e6, 0.03e6) << i;   // ENVISAT: about 780-800 km above the Earth
    EXPECT_NEAR(speed, 7.5e3, 0.1e3) << i;  // Earth-fixed speed
    if (i > 0) {
      // Consecutive positions are one spacing of flight apart.
      const double* q = &proc.orbitPositions[static_cast<std::size_t>(3 * (i - 1))];
      const double d = std::hypot(p[0] - q[0], p[1] - q[1], p[2] - q[2]);
      EXPECT_NEAR(d, speed * proc.orbitSpacing, 0.01 * speed * proc.orbitSpacing) << i;
    }
  }
  // The ascending node precedes the scene by less than one revolution (about 6036 s).
  const double centre = par.azimuthStartTime + duration / 2;
  EXPECT_LT(par.ascending_node_time, centre);
  EXPECT_GT(par.ascending_node_time, centre - 6100.0);
  EXPECT_GT(proc.orbitNumber, 31000);  // absolute orbits of March 2008
  EXPECT_LT(proc.orbitNumber, 31500);

  // A scene outside the orbit file is refused, not extrapolated, with the file's span.
  par.azimuthStartTime = sar::base::ascii2sec85("05-MAR-2008 10:00:00.000000");
  try {
    envi_orbit(kVor, par, proc);
    ADD_FAILURE() << "no error for a scene two days after the orbit";
  } catch (const sar::base::InputError& e) {
    EXPECT_EQ(e.fault(), sar::base::InputFault::kNotCovering);
    EXPECT_EQ(e.file(), kVor);
    EXPECT_NEAR(e.span_start(), sar::base::ascii2sec85("01-MAR-2008 21:55:27.000000"), 1e-6);
    EXPECT_NEAR(e.span_stop(), sar::base::ascii2sec85("03-MAR-2008 00:23:27.000000"), 1e-6);
  }
}

// Elevation antenna correction of the sub-swaths: the gain table itself, and a simulated wide
// swath product whose echoes carry the ASA_XCA pattern of each sub-swath's beam slot in
// elevation, focused with and without the correction.
#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <complex>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <numbers>
#include <string>
#include <vector>

#include "envisat/replica_pattern.hpp"
#include "ws_fixture.hpp"

using namespace sar::scansar;
namespace sim = sar::simulator;

namespace {

constexpr double kDeg = std::numbers::pi / 180.0;

struct GainCase {
  const char* name;
  double reference;  // rad
  double theta;      // rad, the look angle of every column
  double expected;   // gain, 0: outside the table
};

// A pattern rising 0.1 dB an entry from -10 dB at entry 0.
ElevationPattern ramp(double reference) {
  ElevationPattern p;
  p.reference = reference;
  for (int k = 0; k < 201; ++k) p.amplitude.push_back(static_cast<float>(std::pow(10.0, (-10.0 + 0.1 * k) / 20.0)));
  return p;
}

TEST(BeamCorrection, GainIsTheReciprocalPatternAtTheLookAngle) {
  const double fine = 0.05 * kDeg, coarse = 0.072 * kDeg;
  const GainCase cases[] = {
      {"reference entry", 0.3, 0.3, 1.0},
      {"ten entries up", 0.3, 0.3 + 10 * fine, std::pow(10.0, -1.0 / 20.0)},
      {"half way between entries", 0.3, 0.3 - 20.5 * fine,
       1.0 / (0.5 * (std::pow(10.0, -2.1 / 20.0) + std::pow(10.0, -2.0 / 20.0)))},
      // A negative reference angle: the table is 0.072 degrees a step.
      {"negative reference, coarse step", -0.1, -0.1 + 10 * coarse, std::pow(10.0, -1.0 / 20.0)},
      {"last interval", 0.3, 0.3 + 99.5 * fine, 1.0 / (0.5 * (std::pow(10.0, 9.9 / 20.0) + std::pow(10.0, 10.0 / 20.0)))},
      {"beyond the table", 0.3, 0.3 + 101 * fine, 0.0},
      {"before the table", 0.3, 0.3 - 100.5 * fine, 0.0},
  };
  for (const GainCase& c : cases) {
    SCOPED_TRACE(c.name);
    std::vector<float> gain(4, -1.0f);
    const int outside = envi_beam_corr(ramp(c.reference), {c.theta, 0, 0, 0, 0}, 0.0, 1e7, gain);
    if (c.expected == 0.0) {
      EXPECT_EQ(outside, 4);
      for (float g : gain) EXPECT_EQ(g, 1.0f);
    } else {
      EXPECT_EQ(outside, 0);
      for (float g : gain) EXPECT_NEAR(g, c.expected, 1e-5 * c.expected);
    }
  }
  // The look angle follows the polynomial in the column's time from x0.
  std::vector<float> gain(3);
  envi_beam_corr(ramp(0.3), {0.3, 10 * fine / 1e-6, 0, 0, 0}, -1e-6, 1e6, gain);
  EXPECT_NEAR(gain[0], std::pow(10.0, 1.0 / 20.0), 1e-5);  // x = -1 us: entry 90
  EXPECT_NEAR(gain[1], 1.0, 1e-6);
  EXPECT_NEAR(gain[2], std::pow(10.0, -1.0 / 20.0), 1e-5);
}

// Targets of equal reflectivity in a row across SS1 and SS4 at one along-track time. SS4's
// window is moved 1.2 degrees outwards, onto the pattern's flank (about 0.1 dB an entry); SS1
// uses slot 8 as stored.
class ElevationChain : public ::testing::Test {
 protected:
  static constexpr std::array<int, 2> kSwathsMeasured = {0, 3};
  static void SetUpTestSuite() {
    sim::SimulationConfig c = sar::test::ws_product("elevation", {0, 2, 4, 1, 3}, 4, 1000);
    c.targets.resize(1);  // the scene's first target, in SS3
    c.ws.swaths[3].incidence_deg += 1.2;
    for (int s : kSwathsMeasured) {
      const double inc = c.ws.swaths[static_cast<std::size_t>(s)].incidence_deg;
      // Targets some 70 samples apart, so that their range sidelobes do not add to each other's
      // energies, and weak (their chirps overlap in the echo), so that the 8-bit samples do not
      // clip.
      const double step = s == 0 ? 0.1 : 0.05;
      for (int k = -8; k <= 8; ++k) {
        sim::SimulationConfig moved = c;
        moved.ws.swaths[static_cast<std::size_t>(s)].incidence_deg = inc + step * k;
        c.targets.push_back({sim::ws_swath_target(moved, s, 0.0), 5.0});
      }
    }
    config_ = new sim::SimulationConfig(c);
    truth_ = &sar::test::simulated(*config_);
    inputs_ = new sar::test::WsInputs;
    sar::test::prepare(*truth_, config_->out_dir + "/run", *inputs_);
  }
  static void TearDownTestSuite() {
    delete inputs_;
    delete config_;
  }
  static sim::SimulationConfig* config_;
  static const sim::SimulationTruth* truth_;
  static sar::test::WsInputs* inputs_;
};
sim::SimulationConfig* ElevationChain::config_ = nullptr;
const sim::SimulationTruth* ElevationChain::truth_ = nullptr;
sar::test::WsInputs* ElevationChain::inputs_ = nullptr;

// The energy of each target (its response summed over a box in the burst nearest it) across
// the sub-swath, with and without the correction. A uniform scene comes out level when the
// energies of equal targets do; the azimuth focusing keeps a target's energy whatever its
// Doppler rate, so a spread that remains is the pattern's.
TEST_F(ElevationChain, EqualTargetsComeOutLevelAcrossTheSubSwathOnlyWithTheCorrection) {
  ASSERT_NE(inputs_, nullptr);
  sar::test::WsInputs& x = *inputs_;
  scansar scan;
  ASSERT_EQ(derive_geometry(x.channels, scan), 0);
  wsparm par;
  ASSERT_EQ(check_bursts(scan, par), 0);
  std::array<RangeFocused, kSwaths> focused{};
  std::array<CorrelationSums, kSwaths> sums{};
  for (int s = 0; s < kSwaths; ++s)
    ASSERT_EQ(burst_range_focus(x.dir, s, x.channels[static_cast<std::size_t>(s)], scan, par, x.refs.replica,
                                focused[static_cast<std::size_t>(s)], sums[static_cast<std::size_t>(s)]),
              0);
  DopplerEstimate est;
  ASSERT_EQ(burst_doppler(scan, par, x.refs, focused, sums, est), 0);
  // Without de-scalloping: the targets share one along-track time, so the azimuth pattern weighs
  // them alike, and the centroid a scene of a few points gives cannot tilt the row.
  par.compensateAntenna = 0;
  par.swathsToProcess = {0, 0, 0, 0, 0};
  for (int s : kSwathsMeasured) par.swathsToProcess[static_cast<std::size_t>(s)] = 1;

  for (int s : kSwathsMeasured) {
    const auto i = static_cast<std::size_t>(s);
    double reference = 0.0;
    ASSERT_EQ(sar::envisat::envi_slot_pattern(truth_->xca_path, truth_->ins_path, kBeamSlot[i], 0,
                                              par.elevation[i].amplitude, reference),
              0);
    par.elevation[i].reference = reference * kDeg;
    // The orbit's look angle against the simulator's at the targets' zero Doppler.
    for (const sim::TargetTruth& tt : truth_->targets) {
      const double xs = tt.range_time - focused[i].nearTime;
      if (xs < 0.0 || xs > focused[i].width / scan.samplingRate) continue;
      const auto& c = est.slantToElevation[i];
      // The scene geometry puts these targets 0.025 degrees further out than the simulator
      // does (half a pattern entry, a few hundredths of a dB on the pattern's flanks).
      EXPECT_NEAR((c[0] + xs * (c[1] + xs * (c[2] + xs * (c[3] + xs * c[4])))) / kDeg, tt.look_deg, 0.04);
    }
  }

  for (const bool correct : {true, false}) {
    wsparm run = par;
    if (!correct)
      for (auto& e : run.elevation) e.amplitude.clear();
    for (const int s : kSwathsMeasured) {
      const auto i = static_cast<std::size_t>(s);
      SCOPED_TRACE("SS" + std::to_string(s + 1) + (correct ? " corrected" : " not corrected"));
      ASSERT_EQ(burst_azimuth_focus(x.dir, s, scan, run, est, focused[i]), 0);
      const RangeFocused& f = focused[i];
      const int width = f.validColumns - run.rangeOverlap;
      const double outNear = f.nearTime + (f.firstValid + run.rangeOverlap / 2) / scan.samplingRate;
      std::ifstream in(x.dir + "/SS" + std::to_string(s + 1) + ".out", std::ios::binary);
      const std::vector<unsigned char> bytes{std::istreambuf_iterator<char>(in), std::istreambuf_iterator<char>()};
      const std::size_t rec = 17 + 8 * static_cast<std::size_t>(width);
      const int Lpb = run.linesPerBurst[i];
      ASSERT_EQ(bytes.size(), rec * static_cast<std::size_t>(Lpb) * scan.bursts);
      auto at = [&](int burst, int l, int j) {
        std::complex<float> z;
        std::memcpy(&z, bytes.data() + (static_cast<std::size_t>(burst) * Lpb + l) * rec + 17 + 8 * static_cast<std::size_t>(j), 8);
        return z;
      };
      auto number = [&](int burst, int l) {
        int32_t n = 0;
        decode_line_prefix(bytes.data() + (static_cast<std::size_t>(burst) * Lpb + l) * rec, n);
        return n;
      };
      std::vector<double> energyDb, look;
      for (const sim::TargetTruth& tt : truth_->targets) {
        const double sample = (tt.range_time - outNear) * scan.samplingRate;
        if (sample < 20.0 || sample > width - 20.0) continue;
        const double line = (tt.zero_doppler_time - scan.firstLineTime) / run.azimuthStep;
        int best = 0;
        double distance = 1e30;
        for (int b = 0; b < scan.bursts; ++b) {
          const double mid = 0.5 * (number(b, 0) + number(b, Lpb - 1));
          if (std::abs(mid - line) < distance) distance = std::abs(mid - line), best = b;
        }
        const int l0 = static_cast<int>(std::lround(line)) - number(best, 0);
        const int j0 = static_cast<int>(std::lround(sample));
        double e = 0.0;
        for (int l = std::max(0, l0 - 60); l <= std::min(Lpb - 1, l0 + 60); ++l)
          for (int j = j0 - 6; j <= j0 + 6; ++j) e += std::norm(at(best, l, j));
        energyDb.push_back(10.0 * std::log10(e));
        look.push_back(tt.look_deg);
      }
      ASSERT_GE(energyDb.size(), 5u);
      const auto [lo, hi] = std::minmax_element(energyDb.begin(), energyDb.end());
      const double span = *hi - *lo;
      // The trend: the straight line through the energies against the look angle, over the row.
      const double n = static_cast<double>(energyDb.size());
      double sx = 0, sy = 0, sxx = 0, sxy = 0;
      for (std::size_t k = 0; k < energyDb.size(); ++k) {
        sx += look[k], sy += energyDb[k], sxx += look[k] * look[k], sxy += look[k] * energyDb[k];
      }
      const double slope = (n * sxy - sx * sy) / (n * sxx - sx * sx);
      const double trend = std::abs(slope * (look.back() - look.front()));
      RecordProperty("SS" + std::to_string(s + 1) + (correct ? "_corrected" : "_uncorrected"),
                     "span " + std::to_string(span) + " dB, trend " + std::to_string(trend) + " dB over " +
                         std::to_string(energyDb.size()) + " targets");
      if (correct) {
        EXPECT_LT(trend, 0.08);
        // SS1's targets scatter by about 0.1 dB about the trend, with the correction and without.
        EXPECT_LT(span, 0.25);
      } else {
        EXPECT_GT(trend, s == 3 ? 0.3 : 0.5);
      }
    }
  }
}

}  // namespace

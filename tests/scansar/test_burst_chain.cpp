// The burst chain on a simulated wide swath product: a point target in the middle of every
// sub-swath, focused burst by burst and measured on the common time grid against the
// simulator's zero-Doppler truth and against widths derived from the chain's windows.
#include <gtest/gtest.h>

#include <cmath>
#include <complex>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <string>
#include <vector>

#include "analyser/irf.hpp"
#include "base/errors.hpp"
#include "envisat/extract.hpp"
#include "envisat/replica_pattern.hpp"
#include "envisat/table_builder.hpp"
#include "scansar/wide_swath.hpp"
#include "simulated_product.hpp"

using namespace sar::scansar;
namespace sim = sar::simulator;
using sar::envisat::sarpar;

namespace {

constexpr int kSamples = 1000;
constexpr double kPi = 3.14159265358979323846;
constexpr int kTargetOfSwath[5] = {1, 2, 0, 3, 4};  // the first target lies in SS3

sim::SimulationConfig ws_config(const std::string& tag, std::array<int, 5> order) {
  sim::SimulationConfig c = sar::test::small_im_config("scansar_" + tag, {});
  c.mode = sim::AcquisitionMode::kWS;
  c.samples = kSamples;
  c.keep_echoes = false;
  c.ws.order = order;
  c.lines = 525 + 6 * 360;
  c.noise_db = 0.0;
  c.targets = {{{45.0, 10.0, 0.0}, 30.0}};
  for (int s : {0, 1, 3, 4}) c.targets.push_back({sim::ws_swath_target(c, s, 0.0), 30.0});
  return c;
}

struct Chain {
  std::string dir;
  std::vector<sarpar> channels;
  scansar scan;
  wsparm par;
  std::array<RangeFocused, kSwaths> focused;
  std::array<CorrelationSums, kSwaths> sums;
  DopplerEstimate est;
  sar::metadata::SceneReferences refs;
};

// Extraction, orbit and replica; then range focusing and Doppler estimation.
void front_end(const sim::SimulationTruth& t, const std::string& dir, Chain& x) {
  x.dir = dir;
  std::filesystem::create_directories(dir);
  sar::envisat::extconf conf;
  x.channels.resize(5);
  for (int s = 0; s < 5; ++s) {
    x.channels[static_cast<std::size_t>(s)].outputDir = dir;
    x.channels[static_cast<std::size_t>(s)].raw_file = dir + "/SS" + std::to_string(s + 1);
  }
  ASSERT_EQ(sar::envisat::envi_extract(t.level0_path, t.ins_path, "", x.channels, conf,
                                       sar::envisat::timeline_table_builder()),
            0);
  ASSERT_EQ(derive_geometry(x.channels, x.scan), 0);
  ASSERT_EQ(check_bursts(x.scan, x.par), 0);
  sarpar whole = x.channels[0];
  whole.lines = static_cast<int>(x.scan.bursts * x.scan.cycleTime * whole.prf);
  ASSERT_EQ(sar::envisat::envi_orbit(t.orbit_path, whole, x.refs), 0);
  ASSERT_EQ(sar::metadata::synthetic_chirp(x.channels[0], x.refs), 0);
  for (int s = 0; s < 5; ++s)
    ASSERT_EQ(burst_range_focus(dir, s, x.channels[static_cast<std::size_t>(s)], x.scan, x.par, x.refs.replica,
                                x.focused[static_cast<std::size_t>(s)], x.sums[static_cast<std::size_t>(s)]),
              0);
  ASSERT_EQ(burst_doppler(x.scan, x.par, x.refs, x.focused, x.sums, x.est), 0);
}

struct Line {
  double time = 0.0;
  int32_t number = 0;
  std::vector<std::complex<float>> samples;
};

std::vector<Line> read_out(const std::string& path, int width) {
  std::ifstream in(path, std::ios::binary);
  std::vector<unsigned char> bytes{std::istreambuf_iterator<char>(in), std::istreambuf_iterator<char>()};
  const std::size_t rec = 17 + 8 * static_cast<std::size_t>(width);
  std::vector<Line> lines(bytes.size() / rec);
  for (std::size_t l = 0; l < lines.size(); ++l) {
    lines[l].time = decode_line_prefix(bytes.data() + l * rec, lines[l].number);
    lines[l].samples.resize(static_cast<std::size_t>(width));
    std::memcpy(lines[l].samples.data(), bytes.data() + l * rec + 17, 8 * static_cast<std::size_t>(width));
  }
  return lines;
}

// -3 dB width (in units of the variable) of |sum_k w_k exp(j 2 pi x k)| about x = 0, w over k.
double window_width(const std::vector<double>& w, double step) {
  auto level = [&](double x) {
    std::complex<double> s{};
    for (std::size_t k = 0; k < w.size(); ++k) s += w[k] * std::polar(1.0, 2.0 * kPi * x * step * static_cast<double>(k));
    return std::norm(s);
  };
  const double peak = level(0.0);
  double lo = 0.0, hi = 1.0 / (step * static_cast<double>(w.size()));
  for (int i = 0; i < 60; ++i) {
    const double m = 0.5 * (lo + hi);
    (level(m) > 0.5 * peak ? lo : hi) = m;
  }
  return 2.0 * lo;
}

std::vector<double> burst_window(int n, double c) {
  std::vector<double> w(static_cast<std::size_t>(n));
  for (int k = 0; k < n; ++k) w[static_cast<std::size_t>(k)] = (1.0 - c) * std::cos(2.0 * kPi * ((n - 1) / 2.0 - k) / (n - 1)) + c;
  return w;
}

// Range: the chirp band's Hamming weight, as a sum over a fine grid of the band.
double range_width_samples(double c, double B, double fs) {
  std::vector<double> w(2001);
  for (std::size_t k = 0; k < w.size(); ++k) {
    const double f = -B / 2 + B * static_cast<double>(k) / 2000.0;
    w[k] = c + (1.0 - c) * std::cos(2.0 * kPi * f / B);
  }
  return window_width(w, B / 2000.0 / fs);  // x in samples: phase 2 pi f x / fs
}

class WsBurstChain : public ::testing::Test {
 protected:
  static void SetUpTestSuite() {
    config_ = new sim::SimulationConfig(ws_config("chain", {0, 2, 4, 1, 3}));
    truth_ = &sar::test::simulated(*config_);
    chain_ = new Chain;
    front_end(*truth_, config_->out_dir + "/run", *chain_);
  }
  static void TearDownTestSuite() {
    delete chain_;
    delete config_;
  }
  static sim::SimulationConfig* config_;
  static const sim::SimulationTruth* truth_;
  static Chain* chain_;
};
sim::SimulationConfig* WsBurstChain::config_ = nullptr;
const sim::SimulationTruth* WsBurstChain::truth_ = nullptr;
Chain* WsBurstChain::chain_ = nullptr;

// Focused without and with de-scalloping: the de-scalloping gain must not move a target seen
// off the beam centre (here up to a quarter cycle, about 150 Hz, from it in the burst nearest).
TEST_F(WsBurstChain, PointTargetsLieOnTheTimeTagsAndRangeGridWithTheWindowsWidths) {
  ASSERT_NE(chain_, nullptr);
  Chain& x = *chain_;
  for (const int compensate : {0, 1}) {
  x.par.compensateAntenna = compensate;
  for (int s = 0; s < 5; ++s)
    ASSERT_EQ(burst_azimuth_focus(x.dir, s, x.scan, x.par, x.est, x.focused[static_cast<std::size_t>(s)]), 0);
  for (int s = 0; s < 5; ++s) {
    SCOPED_TRACE("SS" + std::to_string(s + 1) + (compensate ? " de-scalloped" : ""));
    const auto i = static_cast<std::size_t>(s);
    const RangeFocused& f = x.focused[i];
    const int width = f.validColumns - x.par.rangeOverlap;
    const double outNear = f.nearTime + (f.firstValid + x.par.rangeOverlap / 2) / x.scan.samplingRate;
    const std::vector<Line> lines = read_out(chain_->dir + "/SS" + std::to_string(s + 1) + ".out", width);
    const int Lpb = x.par.linesPerBurst[i];
    ASSERT_EQ(static_cast<int>(lines.size()), Lpb * x.scan.bursts);
    const sim::TargetTruth& tt = truth_->targets[static_cast<std::size_t>(kTargetOfSwath[s])];
    const double expLine = (tt.zero_doppler_time - x.scan.firstLineTime) / x.par.azimuthStep;
    const double expSample = (tt.range_time - outNear) * x.scan.samplingRate;
    ASSERT_GT(expSample, 40.0);
    ASSERT_LT(expSample, width - 40.0);
    // The burst whose window is centred nearest the target.
    int best = -1;
    double bestDistance = 1e30;
    for (int b = 0; b < x.scan.bursts; ++b) {
      const double mid = 0.5 * (lines[static_cast<std::size_t>(b * Lpb)].number + lines[static_cast<std::size_t>(b * Lpb + Lpb - 1)].number);
      if (std::abs(mid - expLine) < bestDistance) {
        bestDistance = std::abs(mid - expLine);
        best = b;
      }
    }
    std::vector<std::complex<float>> image(static_cast<std::size_t>(Lpb) * width);
    for (int l = 0; l < Lpb; ++l)
      std::copy(lines[static_cast<std::size_t>(best * Lpb + l)].samples.begin(),
                lines[static_cast<std::size_t>(best * Lpb + l)].samples.end(), image.begin() + static_cast<std::ptrdiff_t>(l) * width);
    const int firstNumber = lines[static_cast<std::size_t>(best * Lpb)].number;
    // Time tags agree with the line numbers.
    EXPECT_NEAR(lines[static_cast<std::size_t>(best * Lpb)].time, x.scan.firstLineTime + firstNumber * x.par.azimuthStep, 1.5e-6);
    sar::analyser::ComplexImageView view{image, Lpb, width, width, firstNumber, 0};
    sar::analyser::AnalyserOptions opt;
    opt.neighbourhood = 96;
    opt.search_radius = 12;
    opt.cut_length = 256;
    opt.max_cut_length = 512;
    opt.islr_span = 4.0;
    const sar::analyser::IrfMeasure m = sar::analyser::measure_point(view, expLine, expSample, opt);
    ASSERT_TRUE(m.valid) << m.problem;
    const double ka = x.est.rate[i][0] + x.est.rate[i][1] * (tt.range_time - x.est.refTime) +
                      x.est.rate[i][2] * std::pow(tt.range_time - x.est.refTime, 2);
    const double azTheory = window_width(burst_window(x.scan.echoes[i], x.par.azimuthHamming),
                                         std::abs(ka) / x.scan.prf[i]) / x.par.azimuthStep;
    const double rgTheory = range_width_samples(x.par.rangeHamming, x.scan.chirpBandwidth[i], x.scan.samplingRate);
    RecordProperty("SS" + std::to_string(s + 1) + (compensate ? "_descalloped" : ""),
                   "az_off " + std::to_string(m.peak_line - expLine) + " rg_off " + std::to_string(m.peak_sample - expSample) +
                       " az_res " + std::to_string(m.res_az_px) + "/" + std::to_string(azTheory) + " rg_res " +
                       std::to_string(m.res_rg_px) + "/" + std::to_string(rgTheory) + " pslr_az " +
                       std::to_string(m.pslr_az_db) + " pslr_rg " + std::to_string(m.pslr_rg_db));
    EXPECT_NEAR(m.peak_line, expLine, 0.2);
    EXPECT_NEAR(m.peak_sample, expSample, 0.2);
    EXPECT_NEAR(m.res_az_px / azTheory, 1.0, 0.10);
    EXPECT_NEAR(m.res_rg_px / rgTheory, 1.0, 0.10);
  }
  }
}

}  // namespace

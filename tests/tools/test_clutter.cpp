// Distributed clutter of the simulator: agreement with the point-target echo, Doppler spectrum
// at any centroid, its scaling with radar frequency, contrast, power and determinism.
#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <complex>
#include <filesystem>
#include <fstream>
#include <map>
#include <numeric>
#include <optional>
#include <string>
#include <vector>

#include "dsp/fft.hpp"
#include "simulator/clutter.hpp"
#include "simulator/simulator.hpp"

namespace sim = sar::simulator;

namespace {

using cd = std::complex<double>;
using cf = std::complex<float>;

constexpr double kFs = 19207680.0;
constexpr double kPrf = kFs / 11624.0;
constexpr double kF0 = 5.331004416e9;

double wrap(double x) { return x - kPrf * std::floor(x / kPrf + 0.5); }

// An IM-like acquisition with a constant centroid, without an orbit.
sim::ClutterGeometry plain_geometry(int lines, int samples, double fdc) {
  sim::ClutterGeometry g;
  g.lines = lines;
  g.samples = samples;
  g.prf = kPrf;
  g.sampling_frequency = kFs;
  g.carrier_frequency = kF0;
  g.pulse_length = 521.0 / kFs;
  g.chirp_bandwidth = 255.0 * 62745.098039215685;
  g.near_range_time = 5.5e-3;
  g.satellite_speed = 7100.0;
  g.effective_velocity = [](double tau) { return 6950.0 + 2.0e5 * (tau - 5.5e-3); };
  g.doppler_centroid = [fdc](double) { return fdc; };
  return g;
}

std::vector<cd> clutter_of(const sim::ClutterGeometry& g, const sim::Reflectivity& r) {
  std::vector<cd> echo(static_cast<std::size_t>(g.lines) * static_cast<std::size_t>(g.samples));
  sim::add_clutter(echo, g, r);
  return echo;
}

sim::Reflectivity single_cell(long long row, long long col, float amplitude) {
  return [=](long long m, long long first, std::span<cf> out) {
    std::fill(out.begin(), out.end(), cf{});
    if (m == row && col >= first && col < first + static_cast<long long>(out.size()))
      out[static_cast<std::size_t>(col - first)] = amplitude;
  };
}

// Lines correlated with the chirp: cell n of the scene at sample n.
std::vector<cf> range_compressed(const std::vector<cd>& echo, const sim::ClutterGeometry& g) {
  const int n = sar::dsp::genpow(g.samples + 600, 1);
  std::vector<cf> replica(static_cast<std::size_t>(n)), m(static_cast<std::size_t>(g.lines) * n);
  for (int k = 0; k < 521; ++k) {
    const double v = k / kFs - 0.5 * g.pulse_length;
    replica[static_cast<std::size_t>(k)] = std::polar(1.0f, static_cast<float>(sim::kPi * g.chirp_bandwidth / g.pulse_length * v * v));
  }
  sar::dsp::fft_c(n, n, 1, 1, 1, 0, replica);
  for (int l = 0; l < g.lines; ++l)
    for (int k = 0; k < g.samples; ++k)
      m[static_cast<std::size_t>(l) * n + k] = cf(echo[static_cast<std::size_t>(l) * g.samples + k]);
  sar::dsp::fft_c(n, n, g.lines, g.lines, 1, 0, m);
  for (int l = 0; l < g.lines; ++l)
    for (int k = 0; k < n; ++k) m[static_cast<std::size_t>(l) * n + k] *= std::conj(replica[static_cast<std::size_t>(k)]);
  sar::dsp::fft_c(n, n, g.lines, g.lines, -1, 0, m);
  std::vector<cf> out(static_cast<std::size_t>(g.lines) * g.samples);
  for (int l = 0; l < g.lines; ++l)
    for (int k = 0; k < g.samples; ++k) out[static_cast<std::size_t>(l) * g.samples + k] = m[static_cast<std::size_t>(l) * n + k];
  return out;
}

double mean_power(const std::vector<cd>& v) {
  double s = 0.0;
  for (const cd& x : v) s += std::norm(x);
  return s / static_cast<double>(v.size());
}

// Peak of the azimuth power spectrum averaged over range: smoothed, then a least-squares
// parabola over +-300 Hz around the largest bin. Hz in [-PRF/2, PRF/2).
double spectrum_peak(const std::vector<cd>& echo, int lines, int samples) {
  std::vector<cf> m(echo.begin(), echo.end());
  sar::dsp::fft_c(samples, samples, lines, lines, 0, 1, m);
  std::vector<double> power(static_cast<std::size_t>(lines), 0.0);
  for (int l = 0; l < lines; ++l)
    for (int k = 0; k < samples; ++k) power[static_cast<std::size_t>(l)] += std::norm(m[static_cast<std::size_t>(l) * samples + k]);
  const int half = 300 * lines / static_cast<int>(kPrf);
  int best = 0;
  double best_value = -1.0;
  for (int b = 0; b < lines; ++b) {
    double s = 0.0;
    for (int d = -half; d <= half; ++d) s += power[static_cast<std::size_t>(((b + d) % lines + lines) % lines)];
    if (s > best_value) best_value = s, best = b;
  }
  double s[5] = {0, 0, 0, 0, 0}, t[3] = {0, 0, 0};  // sums of x^0..x^4 and y x^0..x^2
  for (int d = -half; d <= half; ++d) {
    const double x = d * kPrf / lines, y = power[static_cast<std::size_t>(((best + d) % lines + lines) % lines)];
    for (int i = 0; i < 5; ++i) s[i] += std::pow(x, i);
    for (int i = 0; i < 3; ++i) t[i] += y * std::pow(x, i);
  }
  // Normal equations for y = a + b x + c x^2 (the sums of odd powers vanish by symmetry).
  const double c = (t[2] * s[0] - t[0] * s[2]) / (s[4] * s[0] - s[2] * s[2]);
  const double b = t[1] / s[2];
  return wrap(best * kPrf / lines - b / (2.0 * c));
}

TEST(Clutter, ContrastNamesRoundTrip) {
  for (sim::ClutterContrast c : {sim::ClutterContrast::kLow, sim::ClutterContrast::kHigh})
    EXPECT_EQ(sim::clutter_contrast_from_name(sim::clutter_contrast_name(c)), c);
  EXPECT_THROW(sim::clutter_contrast_from_name("medium"), std::invalid_argument);
}

TEST(Clutter, RefusesUnusableGeometry) {
  const sim::Reflectivity none = single_cell(0, 0, 0.0f);
  auto bad = [&](auto change) {
    sim::ClutterGeometry g = plain_geometry(256, 256, 0.0);
    change(g);
    return g;
  };
  EXPECT_THROW(sim::ClutterEcho(bad([](auto& g) { g.prf = 0.0; }), none), std::invalid_argument);
  EXPECT_THROW(sim::ClutterEcho(bad([](auto& g) { g.effective_velocity = nullptr; }), none), std::invalid_argument);
  EXPECT_THROW(sim::ClutterEcho(bad([](auto& g) { g.pattern_extent = 0.0; }), none), std::invalid_argument);
  // A centroid no line of sight can have.
  EXPECT_THROW(sim::ClutterEcho(bad([](auto& g) { g.doppler_centroid = [](double) { return 3.0e5; }; }), none),
               std::invalid_argument);
  EXPECT_THROW(sim::ClutterEcho(plain_geometry(256, 256, 0.0), sim::Reflectivity{}), std::invalid_argument);
  std::vector<cd> wrong(10);
  EXPECT_THROW(sim::add_clutter(wrong, plain_geometry(256, 256, 0.0), none), std::invalid_argument);
}

// One bright cell through the frequency-domain model against the simulator's own time-domain
// echo of a point target at the same place: same chirp, time origin, phase and amplitude,
// with the beam steered to zero Doppler, yaw-steered, or squinted by several PRFs.
TEST(Clutter, SingleCellMatchesThePointTargetEcho) {
  struct Case {
    const char* name;
    bool yaw_steering;
    std::optional<double> centroid;
  };
  for (const Case& k : {Case{"zero-doppler", false, {}}, Case{"yaw-steered", true, {}}, Case{"squinted", false, 2.7 * kPrf}}) {
    sim::SimulationConfig c;
    c.out_dir = std::string(SAR_BINARY_DIR) + "/test_tools_clutter_point";
    std::filesystem::remove_all(c.out_dir);
    c.lines = 2700;
    c.samples = 700;
    c.targets = {{{45.0, 10.0, 0.0}, 30.0}};
    c.noise_db = -200.0;
    c.keep_echoes = true;
    c.attitude.yaw_steering = k.yaw_steering;
    c.centroid_hz = k.centroid;
    const sim::SimulationTruth truth = sim::run_simulation(c);
    std::filesystem::remove_all(c.out_dir);
    const sim::TargetTruth& tt = truth.targets.front();

    sim::ClutterGeometry g = sim::clutter_geometry(c, truth);
    const long long row = std::llround(tt.azimuth_line), col = std::llround(tt.range_sample);
    g.line_offset = tt.azimuth_line - static_cast<double>(row);
    g.sample_offset = tt.range_sample - static_cast<double>(col);
    const std::vector<cd> cl = clutter_of(g, single_cell(row, col, 30.0f));

    const std::vector<double> gain = sim::receive_gain(c.im, c.samples);
    cd cross = 0.0;
    double ea = 0.0, eb = 0.0;
    for (int l = 0; l < c.lines; ++l) {
      if (std::find(truth.calibration_lines.begin(), truth.calibration_lines.end(), l) != truth.calibration_lines.end())
        continue;
      for (int n = 0; n < c.samples; ++n) {
        const std::size_t i = static_cast<std::size_t>(l) * c.samples + n;
        const cd a = cd(truth.echoes[i]) / gain[static_cast<std::size_t>(n)], b = cl[i];
        cross += std::conj(a) * b;
        ea += std::norm(a);
        eb += std::norm(b);
      }
    }
    EXPECT_GT(std::abs(cross) / std::sqrt(ea * eb), 0.99) << k.name;
    EXPECT_LT(std::abs(std::arg(cross)), 0.05) << k.name;  // same carrier phase
    EXPECT_NEAR(std::sqrt(eb / ea), 1.0, 0.01) << k.name;   // same amplitude
  }
}

// Random clutter at centroids of several PRFs, both signs: the azimuth spectrum peaks at the
// centroid folded into the PRF.
TEST(Clutter, AzimuthSpectrumPeaksAtTheFoldedCentroid) {
  for (double ambiguity : {-2.3, 0.45, 2.7}) {
    const double fdc = ambiguity * kPrf;
    const sim::ClutterGeometry g = plain_geometry(2048, 512, fdc);
    sim::ClutterOptions o;
    o.power_db = 20.0;
    const std::vector<cd> echo = clutter_of(g, sim::random_reflectivity(o, g, 7));
    EXPECT_NEAR(wrap(spectrum_peak(echo, g.lines, g.samples) - fdc), 0.0, 10.0) << ambiguity << " PRF";
  }
}

// The centroid of a stationary scene is proportional to the radar frequency: across the range
// band it moves by fdc fr / f0. Measured on the two-dimensional spectrum of one cell's echo,
// which is noise free.
TEST(Clutter, CentroidScalesWithRadarFrequency) {
  for (double ambiguity : {-2.3, 2.7}) {
    const double fdc = ambiguity * kPrf;
    sim::ClutterGeometry g = plain_geometry(3000, 600, fdc);
    // Place the cell so that its whole main lobe falls inside the lines.
    const double tau = g.near_range_time, lambda = sim::kSpeedOfLight / kF0, vr = g.effective_velocity(tau);
    const double centre = -lambda * (0.5 * sim::kSpeedOfLight * tau) * fdc / (2.0 * vr * vr) * kPrf;
    const std::vector<cd> echo = clutter_of(g, single_cell(std::llround(1500.0 - centre), 40, 1.0f));
    std::vector<cf> m(echo.begin(), echo.end());
    sar::dsp::fft_c(g.samples, g.samples, g.lines, g.lines, 1, 1, m);
    // Centroid per range bin from the first circular moment of the azimuth power spectrum.
    std::vector<double> fr, shift;
    for (int q = 0; q < g.samples; ++q) {
      const double f = (q < g.samples / 2 ? q : q - g.samples) * kFs / g.samples;
      if (std::abs(f) > 0.4 * kFs) continue;
      cd moment = 0.0;
      for (int b = 0; b < g.lines; ++b)
        moment += static_cast<double>(std::norm(m[static_cast<std::size_t>(b) * g.samples + q])) * std::polar(1.0, 2.0 * sim::kPi * b / g.lines);
      fr.push_back(f);
      shift.push_back(wrap(std::arg(moment) / (2.0 * sim::kPi) * kPrf - fdc));
    }
    const double mx = std::accumulate(fr.begin(), fr.end(), 0.0) / fr.size();
    const double my = std::accumulate(shift.begin(), shift.end(), 0.0) / shift.size();
    double sxy = 0.0, sxx = 0.0;
    for (std::size_t i = 0; i < fr.size(); ++i) {
      sxy += (fr[i] - mx) * (shift[i] - my);
      sxx += (fr[i] - mx) * (fr[i] - mx);
    }
    EXPECT_NEAR(sxy / sxx / (fdc / kF0), 1.0, 0.1) << ambiguity << " PRF";
    EXPECT_NEAR(my, 0.0, 2.0) << ambiguity << " PRF";
  }
}

// Low contrast is fully developed speckle: intensity contrast 1. High contrast adds texture,
// bright points and dark water: a contrast near 17, and land and water on either side of the
// edge once the echoes are compressed in range.
TEST(Clutter, ContrastOptionChangesTheScene) {
  const sim::ClutterGeometry g = plain_geometry(512, 2048, 0.0);
  std::map<sim::ClutterContrast, double> contrast, near_over_far;
  for (sim::ClutterContrast kind : {sim::ClutterContrast::kLow, sim::ClutterContrast::kHigh}) {
    sim::ClutterOptions o;
    o.power_db = 10.0;
    o.contrast = kind;
    const sim::Reflectivity r = sim::random_reflectivity(o, g, 3);
    std::vector<cf> row(static_cast<std::size_t>(g.samples));
    double s1 = 0.0, s2 = 0.0, n = 0.0;
    for (long long m = 0; m < 2048; ++m) {
      r(m, 0, row);
      for (const cf& v : row) {
        const double i = std::norm(v);
        s1 += i;
        s2 += i * i;
        n += 1.0;
      }
    }
    contrast[kind] = std::sqrt(s2 / n - (s1 / n) * (s1 / n)) / (s1 / n);
    // Cells whose whole echo lies in the window: land before the edge's nearest approach,
    // water beyond its farthest.
    const std::vector<cd> echo = clutter_of(g, r);
    const std::vector<cf> compressed = range_compressed(echo, g);
    double near = 0.0, far = 0.0;
    for (int l = 0; l < g.lines; ++l)
      for (int k = 0; k < 100; ++k) {
        near += std::norm(compressed[static_cast<std::size_t>(l) * g.samples + 250 + k]);
        far += std::norm(compressed[static_cast<std::size_t>(l) * g.samples + 1250 + k]);
      }
    near_over_far[kind] = near / far;
    EXPECT_NEAR(10.0 * std::log10(mean_power(echo)), 10.0, kind == sim::ClutterContrast::kLow ? 0.2 : 1.0);
  }
  EXPECT_NEAR(contrast[sim::ClutterContrast::kLow], 1.0, 0.03);
  EXPECT_GT(contrast[sim::ClutterContrast::kHigh], 10.0);
  EXPECT_NEAR(near_over_far[sim::ClutterContrast::kLow], 1.0, 0.15);
  EXPECT_GT(near_over_far[sim::ClutterContrast::kHigh], 15.0);
}

// The scene is a function of the seed alone: the same lines come out whatever the azimuth
// blocking, and the range blocking changes them only by the documented approximation.
TEST(Clutter, DeterministicAndIndependentOfBlocking) {
  sim::ClutterGeometry g = plain_geometry(1500, 400, 2.7 * kPrf);
  sim::ClutterOptions o;
  o.power_db = 0.0;
  o.contrast = sim::ClutterContrast::kHigh;
  const std::vector<cd> a = clutter_of(g, sim::random_reflectivity(o, g, 11));
  EXPECT_EQ(a, clutter_of(g, sim::random_reflectivity(o, g, 11)));
  EXPECT_NE(a, clutter_of(g, sim::random_reflectivity(o, g, 12)));

  auto relative_difference = [&](const std::vector<cd>& b) {
    double d = 0.0;
    for (std::size_t i = 0; i < a.size(); ++i) d += std::norm(a[i] - b[i]);
    return std::sqrt(d / (mean_power(a) * static_cast<double>(a.size())));
  };
  sim::ClutterGeometry split = g;
  split.max_fft_lines = 3000;
  {
    sim::ClutterEcho echo(split, sim::random_reflectivity(o, split, 11));
    EXPECT_LT(echo.block_lines(), g.lines);  // really split in azimuth
  }
  EXPECT_LT(relative_difference(clutter_of(split, sim::random_reflectivity(o, split, 11))), 1e-4);
  split = g;
  split.range_block = 128;
  EXPECT_LT(relative_difference(clutter_of(split, sim::random_reflectivity(o, split, 11))), 0.05);
}

// Clutter in a product: the echoes carry the power asked for, a SWST change shifts the clutter
// with the window, and the truth file tells the centroid.
TEST(Clutter, ProductCarriesClutterAndItsTruth) {
  auto config = [](const std::string& name, std::vector<sim::Fault> faults) {
    sim::SimulationConfig c;
    c.out_dir = std::string(SAR_BINARY_DIR) + "/test_tools_clutter_" + name;
    std::filesystem::remove_all(c.out_dir);
    c.lines = 900;
    c.samples = 400;
    c.targets = {{{45.0, 10.0, 0.0}, 0.0}};
    c.noise_db = -200.0;
    c.keep_echoes = true;
    c.clutter.power_db = 20.0;
    c.centroid_hz = 1.3 * kPrf;
    c.faults = std::move(faults);
    return c;
  };
  const sim::SimulationConfig plain = config("plain", {}), shifted = config("swst", {sim::Fault::kSwstChange});
  const sim::SimulationTruth a = sim::run_simulation(plain), b = sim::run_simulation(shifted);
  const std::vector<double> gain = sim::receive_gain(plain.im, plain.samples);
  ASSERT_TRUE(a.clutter.present);
  // The clutter sees the beam of the attitude, squinted here to 1.3 PRF.
  EXPECT_NEAR(a.clutter.centroid_mid, a.doppler_centroid, 1e-6);
  EXPECT_NEAR(a.clutter.centroid_mid, 1.3 * kPrf, 1.0);
  EXPECT_EQ(a.clutter.ambiguity_mid, 1);

  double power = 0.0, n = 0.0;
  for (int l = 0; l < plain.lines; ++l)
    for (int k = 0; k < plain.samples; ++k) {
      power += std::norm(cd(a.echoes[static_cast<std::size_t>(l) * plain.samples + k]) / gain[static_cast<std::size_t>(k)]);
      n += 1.0;
    }
  EXPECT_NEAR(10.0 * std::log10(power / n * a.line_count / a.echo_lines), 20.0, 0.5);

  const int shift = b.swst_code_after_change - b.swst_code;
  ASSERT_GT(shift, 0);
  // The two windows are simulated with range blocks of their own widths: equal to the
  // approximation of the range blocks.
  double error = 0.0, energy = 0.0;
  for (int l = b.swst_change_line; l < plain.lines; ++l) {
    if (std::find(a.calibration_lines.begin(), a.calibration_lines.end(), l) != a.calibration_lines.end()) continue;
    const std::size_t i = static_cast<std::size_t>(l) * plain.samples;
    for (int k = 0; k + shift < plain.samples; ++k) {
      const cd before = cd(a.echoes[i + static_cast<std::size_t>(k + shift)]) / gain[static_cast<std::size_t>(k + shift)];
      const cd after = cd(b.echoes[i + static_cast<std::size_t>(k)]) / gain[static_cast<std::size_t>(k)];
      error += std::norm(after - before);
      energy += std::norm(before);
    }
  }
  EXPECT_LT(std::sqrt(error / energy), 0.01);

  std::ifstream in(a.truth_path);
  std::map<std::string, std::string> keys;
  std::string line, section;
  while (std::getline(in, line)) {
    if (!line.empty() && line[0] == '[') section = line;
    const std::size_t eq = line.find(" = ");
    if (section == "[clutter]" && eq != std::string::npos) keys[line.substr(0, eq)] = line.substr(eq + 3);
  }
  EXPECT_EQ(keys["contrast"], "low");
  EXPECT_NEAR(std::stod(keys["power_db"]), 20.0, 1e-9);
  for (const char* k : {"doppler_centroid_near", "doppler_centroid_far"}) EXPECT_EQ(keys.count(k), 1u) << k;
  EXPECT_NEAR(std::stod(keys["doppler_centroid_mid"]), a.clutter.centroid_mid, 1e-5);
  EXPECT_EQ(keys["ambiguity_mid"], std::to_string(a.clutter.ambiguity_mid));
  std::filesystem::remove_all(plain.out_dir);
  std::filesystem::remove_all(shifted.out_dir);
}

}  // namespace

// De-scalloping and alias rejection of the burst azimuth focuser on synthetic range-focused
// bursts. Column j holds the echo of one scatterer, at zero-Doppler time t_j, of the
// simulator's point model: the quadratic phase of the column's Doppler rate and the two-way
// pattern sinc^2(L (f - fdc) / (2 V)) of a uniform antenna (sinc(x) = sin(pi x) / (pi x)).
// The scatterers sweep the burst's output window, so the sum over columns of the output power
// at a line is the mean power a uniform scene (unit reflectivity per cell, uncorrelated) gives
// there, free of speckle.
#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <complex>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <functional>
#include <iterator>
#include <numeric>
#include <random>
#include <string>
#include <unistd.h>
#include <vector>

#include "dsp/fft.hpp"
#include "multilook/ws_multilook.hpp"
#include "scansar/files.hpp"
#include "scansar/wide_swath.hpp"

using namespace sar::scansar;

namespace {

constexpr double kPi = 3.14159265358979323846;
constexpr double kC = 299792458.0;
constexpr int kSwath = 2;  // SS3
constexpr int kScatterers = 1024;

struct Synthetic {
  std::string dir;
  scansar scan;
  wsparm par;
  RangeFocused focused;
  DopplerEstimate est;
  std::vector<double> scattererTime;  // s from the scene's first line, per column
  double trueCentroid = 0.0;
};

double sinc(double x) { return x == 0.0 ? 1.0 : std::sin(kPi * x) / (kPi * x); }

// One burst of SS3: 56 echoes at 1656 Hz, a scatterer per column, centroid fdc.
Synthetic make_burst(const std::string& tag, double fdc, bool sparse = false) {
  Synthetic x;
  x.dir = std::string(SAR_BINARY_DIR) + "/scansar_" + tag + "_" + std::to_string(::getpid());
  std::filesystem::create_directories(x.dir);
  scansar& s = x.scan;
  s.samplingRate = 19207680.0;
  s.carrierFrequency = 5.331004416e9;
  s.firstLineTime = 7.0e8;
  s.bursts = 1;
  s.cycleTime = 0.19;
  const auto i = static_cast<std::size_t>(kSwath);
  s.prf[i] = 1656.0;
  s.echoes[i] = 56;
  s.chirpBandwidth[i] = 16e6;
  s.nearTime[i] = 5.6e-3;
  x.trueCentroid = fdc;
  x.par.antennaLength = 10.0;
  const int width = kScatterers + x.par.rangeOverlap;
  x.focused = {width, 0, width, s.nearTime[i]};
  x.est.refTime = s.nearTime[i];
  const double ka0 = -2074.0, tau0 = s.nearTime[i];
  x.est.rate[i] = {ka0, -ka0 / tau0, ka0 / (tau0 * tau0), 0.0, 0.0};
  x.est.centroid[i] = {fdc, 0.0, 0.0, 0.0, 0.0};
  x.est.satelliteSpeed = 7100.0;
  const double lambda = kC / s.carrierFrequency;
  const int N = s.echoes[i];
  const double p = s.prf[i];
  const double tc = (N - 1) / (2.0 * p);
  // Scatterers spread over the window and a tenth of a second beyond each end, in a random
  // order: what little of a column leaks into its neighbours then adds no pattern of its own.
  // Sparse: one column in 64 holds a scatterer, the others nothing.
  const double h = half_window(s, x.par);
  const double centre = tc - fdc / ka0, span = 2.0 * h + 0.2;
  // Only the columns the focuser outputs hold scatterers (it trims the range sub-blocks' margins).
  const int h2 = x.par.rangeOverlap / 2, used = width - 2 * h2;
  std::vector<int> slots(static_cast<std::size_t>(used));
  std::iota(slots.begin(), slots.end(), 0);
  std::mt19937 random(7);
  std::shuffle(slots.begin(), slots.end(), random);
  x.scattererTime.assign(static_cast<std::size_t>(width), 1e9);
  for (int j = h2; j < width - h2; ++j)
    x.scattererTime[static_cast<std::size_t>(j)] = centre - span / 2 + span * slots[static_cast<std::size_t>(j - h2)] / used;
  // Echo by echo in the range frequency domain: each scatterer's full-band response moved to
  // its range at that echo (the migration of the hyperbola), with its carrier phase.
  const int L = 2048;
  std::vector<std::complex<float>> rows(static_cast<std::size_t>(N) * width);
  std::vector<std::complex<double>> spectrum(static_cast<std::size_t>(L));
  sar::dsp::cvector line(static_cast<std::size_t>(L));
  for (int e = 0; e < N; ++e) {
    std::fill(spectrum.begin(), spectrum.end(), std::complex<double>{});
    for (int j = 0; j < width; ++j) {
      if ((sparse && j % 64 != 32) || j < h2 || j >= width - h2) continue;
      const double tau = s.nearTime[i] + j / s.samplingRate;
      const double ka = ka0 * tau0 / tau;
      const double R0 = kC * tau / 2.0;
      const double vr2 = -lambda * R0 * ka / 2.0;
      const double t = e / p - x.scattererTime[static_cast<std::size_t>(j)];
      const double dR = std::sqrt(R0 * R0 + vr2 * t * t) - R0;
      const double g = sinc(x.par.antennaLength * (ka * t - fdc) / (2.0 * x.est.satelliteSpeed));
      const double position = j + 2.0 * dR / kC * s.samplingRate;
      const std::complex<double> a = std::polar(g * g, -4.0 * kPi * dR / lambda);
      const std::complex<double> step = std::polar(1.0, -2.0 * kPi * position / L);
      const std::complex<double> negative = std::polar(1.0, 2.0 * kPi * position);
      std::complex<double> w = a;
      for (int k = 0; k < L; ++k) {
        spectrum[static_cast<std::size_t>(k)] += k > L / 2 ? w * negative : w;
        w *= step;
      }
    }
    for (int k = 0; k < L; ++k)
      line[static_cast<std::size_t>(k)] = std::complex<float>(spectrum[static_cast<std::size_t>(k)]);
    sar::dsp::fft_c(L, L, 1, 1, -1, 0, line);
    std::copy_n(line.begin(), width, rows.begin() + static_cast<std::ptrdiff_t>(e) * width);
  }
  (void)lambda;
  ByteWriter out(x.dir + "/rgfoc_ss" + std::to_string(kSwath + 1));
  const double near = s.nearTime[i];
  out.write(&near, 8);
  out.write(rows.data(), 8 * static_cast<int64_t>(rows.size()));
  out.commit();
  EXPECT_EQ(check_bursts(s, x.par), 0);
  return x;
}

struct Output {
  std::vector<int32_t> number;
  std::vector<std::vector<std::complex<float>>> lines;
};

Output focus(Synthetic& x) {
  Output o;
  EXPECT_EQ(burst_azimuth_focus(x.dir, kSwath, x.scan, x.par, x.est, x.focused), 0);
  const int W = x.focused.validColumns - x.par.rangeOverlap;
  std::ifstream in(x.dir + "/SS" + std::to_string(kSwath + 1) + ".out", std::ios::binary);
  std::vector<unsigned char> bytes{std::istreambuf_iterator<char>(in), std::istreambuf_iterator<char>()};
  const std::size_t rec = 17 + 8 * static_cast<std::size_t>(W);
  for (std::size_t l = 0; l < bytes.size() / rec; ++l) {
    int32_t n = 0;
    decode_line_prefix(bytes.data() + l * rec, n);
    o.number.push_back(n);
    std::vector<std::complex<float>> v(static_cast<std::size_t>(W));
    std::memcpy(v.data(), bytes.data() + l * rec + 17, 8 * v.size());
    o.lines.push_back(std::move(v));
  }
  return o;
}

// Peak-to-peak (dB) of the summed power over the lines within `inner` of the window centre,
// averaged in runs of 8 lines.
double ripple_db(const Synthetic& x, const Output& o, double inner) {
  const auto i = static_cast<std::size_t>(kSwath);
  const double tc = (x.scan.echoes[i] - 1) / (2.0 * x.scan.prf[i]);
  const double centre = tc - x.trueCentroid / x.est.rate[i][0];
  std::vector<double> power;
  for (std::size_t l = 0; l < o.lines.size(); ++l) {
    const double T = o.number[l] * x.par.azimuthStep;
    if (std::abs(T - centre) > inner) continue;
    double sum = 0.0;
    for (const auto& z : o.lines[l]) sum += std::norm(z);
    power.push_back(sum);
  }
  double lo = 1e300, hi = 0.0;
  for (std::size_t k = 0; k + 8 <= power.size(); k += 8) {
    double m = 0.0;
    for (std::size_t q = k; q < k + 8; ++q) m += power[q];
    lo = std::min(lo, m);
    hi = std::max(hi, m);
  }
  return power.size() < 16 ? 1e9 : 10.0 * std::log10(hi / lo);
}

// The profile the multilooker makes of a train of bursts one cycle apart, each with the power
// profile P(d) (d: time from the burst's centre): every line the sum of the bursts around it,
// weighted by the burst weights w(v)^2, v = d / cycle. Peak-to-peak (dB) over one cycle.
double joined_ripple_db(const std::function<double(double)>& P, double cycle, double step, double w1, double w2) {
  double lo = 1e300, hi = 0.0;
  for (double t = 0.0; t < cycle; t += step) {
    double sum = 0.0;
    for (int k = -2; k <= 2; ++k) {
      const double w = sar::multilook::burst_weight((t + k * cycle) / cycle, w1, w2);
      sum += w * w * P(t + k * cycle);
    }
    lo = std::min(lo, sum);
    hi = std::max(hi, sum);
  }
  return 10.0 * std::log10(hi / lo);
}

// The focused burst's power profile, summed over the columns, linear between lines.
std::function<double(double)> burst_profile(const Synthetic& x, const Output& o) {
  const auto i = static_cast<std::size_t>(kSwath);
  const double tc = (x.scan.echoes[i] - 1) / (2.0 * x.scan.prf[i]);
  const double centre = tc - x.trueCentroid / x.est.rate[i][0];
  const double a = x.par.azimuthStep;
  std::vector<double> power;
  for (const auto& line : o.lines) {
    double sum = 0.0;
    for (const auto& z : line) sum += std::norm(z);
    power.push_back(sum);
  }
  const double d0 = o.number.front() * a - centre;
  return [power, d0, a](double d) {
    const double u = (d - d0) / a;
    if (u <= 0.0 || u >= static_cast<double>(power.size() - 1)) return 0.0;
    const auto k = static_cast<std::size_t>(u);
    return (1.0 - (u - k)) * power[k] + (u - k) * power[k + 1];
  };
}

struct ScallopCase {
  const char* name;
  double centroid;       // Hz, the scene's
  double centroidError;  // Hz, added to the estimate the focuser is given
  bool normalisedSinc;
  double limitDb;        // the ripple must stay below it (or, for a failing row, exceed it)
  bool passes;
  double spanCycles;     // half the span measured, in burst cycles; 0: the window less 30 ms;
                         // below 0: the profile the multilooker joins with burst weights w1, w2
  double w1 = 0.25, w2 = 0.5;  // cycles
};

class Descalloping : public ::testing::TestWithParam<ScallopCase> {};

TEST_P(Descalloping, UniformSceneProfileAcrossTheBurstWindow) {
  const ScallopCase& c = GetParam();
  Synthetic x = make_burst(c.name, c.centroid);
  x.est.centroid[kSwath][0] += c.centroidError;
  x.par.normalisedSinc = c.normalisedSinc;
  const Output o = focus(x);
  ASSERT_FALSE(o.lines.empty());
  const double inner = c.spanCycles > 0.0 ? c.spanCycles * x.scan.cycleTime : half_window(x.scan, x.par) - 0.03;
  const double ripple = c.spanCycles < 0.0
                            ? joined_ripple_db(burst_profile(x, o), x.scan.cycleTime, x.par.azimuthStep, c.w1, c.w2)
                            : ripple_db(x, o, inner);
  RecordProperty("ripple_db", std::to_string(ripple));
  RecordProperty("ripple_whole_window_db", std::to_string(ripple_db(x, o, half_window(x.scan, x.par) - 0.03)));
  if (c.centroidError != 0.0) {
    // What a centroid error leaves: the ratio of the pattern about the true centroid to the one
    // about the estimate, across the span or joined as the multilooker joins the bursts.
    ScallopModel m{x.par.antennaLength * x.scan.carrierFrequency / kC,
                   0.5 * kC / x.scan.carrierFrequency / x.est.satelliteSpeed, false};
    const double ka = x.est.rate[kSwath][0];
    const double h = half_window(x.scan, x.par);
    auto ratio = [&](double d) {
      const double f = c.centroid - ka * d;
      return std::abs(d) > h ? 0.0 : m.gain(f, c.centroid) / m.gain(f, c.centroid + c.centroidError);
    };
    double model = 0.0;
    if (c.spanCycles < 0.0) {
      model = joined_ripple_db(ratio, x.scan.cycleTime, x.par.azimuthStep, c.w1, c.w2);
    } else {
      double lo = 1e9, hi = -1e9;
      for (double d = -inner; d <= inner; d += inner / 50) {
        lo = std::min(lo, 10.0 * std::log10(ratio(d)));
        hi = std::max(hi, 10.0 * std::log10(ratio(d)));
      }
      model = hi - lo;
    }
    RecordProperty("ripple_model_db", std::to_string(model));
    EXPECT_NEAR(ripple, model, std::max(0.05, 0.1 * model));
  }
  if (c.passes)
    EXPECT_LT(ripple, c.limitDb);
  else
    EXPECT_GT(ripple, c.limitDb);
  std::filesystem::remove_all(x.dir);
}

INSTANTIATE_TEST_SUITE_P(
    Rows, Descalloping,
    ::testing::Values(ScallopCase{"exact", 0.0, 0.0, false, 0.05, true, 0.0},
                      ScallopCase{"exact_squinted", 180.0, 0.0, false, 0.05, true, 0.0},
                      // A 50 Hz error tilts the profile by the pattern's slope: 0.3 dB over the
                      // middle half cycle of the window, about 0.9 dB over the whole of it.
                      ScallopCase{"centroid_off_50hz", 0.0, 50.0, false, 0.3, true, 0.25},
                      ScallopCase{"centroid_off_50hz_whole_window", 0.0, 50.0, false, 1.0, true, 0.0},
                      // What reaches the image: the multilooker keeps a burst's lines within
                      // W1 + W2 cycles of its centre, tapered beyond W1, and adds overlapping
                      // bursts in power, so that their tilts partly cancel. With the default
                      // weights (0.25, 0.5) the joined profile keeps half a cycle of the tilt:
                      // 0.31 dB by the pattern alone, which the row checks against.
                      ScallopCase{"centroid_off_50hz_joined", 0.0, 50.0, false, 0.35, true, -1.0},
                      ScallopCase{"exact_joined", 0.0, 0.0, false, 0.05, true, -1.0},
                      // sin(pi y) / (pi y) of an argument that already holds pi: the beam comes
                      // out pi times too narrow and the edges of the window are boosted.
                      ScallopCase{"normalised_sinc", 0.0, 0.0, true, 0.05, false, 0.0}),
    [](const auto& info) { return std::string(info.param.name); });

TEST(Descalloping, WithoutCompensationTheProfileFollowsThePattern) {
  Synthetic x = make_burst("off", 0.0);
  x.par.compensateAntenna = 0;
  const Output o = focus(x);
  // At the window's ends the two-way power pattern is down by G(|Ka| h), here about 2.4 dB.
  const double ripple = ripple_db(x, o, half_window(x.scan, x.par) - 0.01);
  EXPECT_GT(ripple, 1.5);
  std::filesystem::remove_all(x.dir);
}

// The focused burst repeats every Nf / PRF; the copies of a target one period away must not
// come through the resampling. The alias-rejection low-pass stops at twice the burst band and
// the copies sit at three burst bands and more. The ghost is what the block's period adds:
// the difference against the same burst focused in a block four times longer, whose copies lie
// far outside the window, around one period from each target.
TEST(BurstAliases, GhostsOnePeriodAwayAreRejected) {
  Synthetic x = make_burst("ghosts", 0.0, true);
  const Output o = focus(x);
  x.par.burstPadding = 12;
  const Output wide = focus(x);
  ASSERT_EQ(o.lines.size(), wide.lines.size());
  const auto i = static_cast<std::size_t>(kSwath);
  const double period = sar::dsp::genpow(3 * x.scan.echoes[i], 1) / x.scan.prf[i];
  const double tc = (x.scan.echoes[i] - 1) / (2.0 * x.scan.prf[i]);
  const double h = half_window(x.scan, x.par);
  const std::size_t h2 = static_cast<std::size_t>(x.par.rangeOverlap / 2);
  double worst = -1e9;
  int measured = 0;
  for (std::size_t j = 0; j + 2 * h2 < x.scattererTime.size(); ++j) {
    if ((j + h2) % 64 != 32) continue;
    const double tj = x.scattererTime[j + h2];
    if (std::abs(tj - tc) > h) continue;
    double peak = 0.0, ghost = 0.0;
    for (std::size_t l = 0; l < o.lines.size(); ++l) {
      const double T = o.number[l] * x.par.azimuthStep;
      if (std::abs(T - tj) < 0.01) peak = std::max(peak, static_cast<double>(std::norm(o.lines[l][j])));
      if (std::abs(std::abs(T - tj) - period) < 0.02)
        ghost = std::max(ghost, static_cast<double>(std::norm(o.lines[l][j] - wide.lines[l][j])));
    }
    if (peak <= 0.0) continue;
    ++measured;
    worst = std::max(worst, 10.0 * std::log10(std::max(ghost, 1e-30) / peak));
  }
  RecordProperty("worst_ghost_db", std::to_string(worst));
  EXPECT_GE(measured, 5);
  EXPECT_LT(worst, -40.0);
  std::filesystem::remove_all(x.dir);
}

// The de-scalloping gain changes across a response; the lines are read where that leaves every
// peak at its scatterer's time, wherever in the window the scatterer lies.
TEST(Descalloping, PeaksStayAtTheScatterersTimes) {
  for (const int compensate : {0, 1}) {
    SCOPED_TRACE(compensate ? "de-scalloped" : "not de-scalloped");
    Synthetic x = make_burst(std::string("peaks") + std::to_string(compensate), 0.0, true);
    x.par.compensateAntenna = compensate;
    const Output o = focus(x);
    const std::size_t h2 = static_cast<std::size_t>(x.par.rangeOverlap / 2);
    const double tc = (x.scan.echoes[kSwath] - 1) / (2.0 * x.scan.prf[kSwath]);
    double worst = 0.0, farthest = 0.0;
    for (std::size_t j = 0; j + 2 * h2 < x.scattererTime.size(); ++j) {
      if ((j + h2) % 64 != 32) continue;
      const double tj = x.scattererTime[j + h2];
      if (std::abs(tj - tc) > half_window(x.scan, x.par) - 0.02) continue;
      std::size_t best = 0;
      for (std::size_t l = 0; l < o.lines.size(); ++l)
        if (std::norm(o.lines[l][j]) > std::norm(o.lines[best][j])) best = l;
      ASSERT_GT(best, 0u);
      ASSERT_LT(best + 1, o.lines.size());
      const double p0 = std::norm(o.lines[best - 1][j]), p1 = std::norm(o.lines[best][j]), p2 = std::norm(o.lines[best + 1][j]);
      const double peak = o.number[best] + 0.5 * (p0 - p2) / (p0 - 2.0 * p1 + p2);
      worst = std::max(worst, std::abs(peak - tj / x.par.azimuthStep));
      farthest = std::max(farthest, std::abs(tj - tc));
    }
    RecordProperty(compensate ? "worst_offset_descalloped" : "worst_offset", std::to_string(worst));
    EXPECT_GT(farthest, 0.1);  // scatterers well off the beam centre are among them
    EXPECT_LT(worst, 0.05);    // lines
    std::filesystem::remove_all(x.dir);
  }
}

}  // namespace

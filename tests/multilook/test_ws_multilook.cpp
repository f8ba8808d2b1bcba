// Wide swath multilook of simulated WSS products: a uniform scene comes out flat across the
// sub-swath seams and along azimuth, with the looks its weights and range looks give.
#include <gtest/gtest.h>
#include <unistd.h>

#include <algorithm>
#include <cmath>
#include <filesystem>
#include <functional>
#include <numeric>

#include "envisat/level1.hpp"
#include "multilook/wss_input.hpp"
#include "multilook/ws_multilook.hpp"
#include "simulator/wss_product.hpp"
#include "strip_fixture.hpp"

namespace sar::multilook {
namespace {

namespace fs = std::filesystem;
using testing::read_float_raster;
using testing::temp_dir;

const std::string kOrbit =
    std::string(SAR_REAL_DATA_DIR) + "/DOR_VOR_AX/DOR_VOR_AXVF-P20080331_075200_20080301_215527_20080303_002327";

struct WsRun {
  int status = -1;
  WsMultilookResult result;
  std::vector<float> amplitude;
  int lines = 0, samples = 0;
  std::array<WsSubSwath, 5> swaths;
};

/// A uniform wide scene: sub-swaths of 1800 samples, so that the incidence (and with it the look
/// band) changes from the first to the last.
const simulator::WssProduct& uniform_product() {
  static simulator::WssProduct product = [] {
    simulator::WssConfig c;
    c.out_dir = temp_dir("wss_uniform");
    c.orbit_path = kOrbit;
    c.samples = 1800;
    c.overlap = 120;
    c.bursts = 5;
    c.burst_lines = 320;
    c.cycle_lines = 200;
    return simulator::write_wss_product(c);
  }();
  return product;
}

WsRun multilook(const std::string& product, WsMultilookConfig cfg,
                const std::function<void(std::array<WsSubSwath, 5>&)>& edit = {}) {
  WsRun r;
  envisat::Level1Product p;
  std::string error;
  EXPECT_EQ(envisat::read_level1(product, p, error), 0) << error;
  EXPECT_EQ(wss_sub_swaths(p, r.swaths, error), 0) << error;
  if (edit) edit(r.swaths);
  SlcGrid orbit;
  EXPECT_EQ(orbit_geometry(kOrbit, p.firstLineTime, 5.331e9, orbit, error), 0) << error;
  cfg.lineStep = p.lineTimeInterval;
  cfg.samplingRate = 299792458.0 / (2.0 * p.rangeSpacing);
  const std::string out = fs::path(product).parent_path() / (cfg.groundRange ? "scene_gr" : "scene_pwr");
  r.status = run_ws_multilook(r.swaths, cfg, orbit, out, r.result);
  if (r.status == 0) r.amplitude = read_float_raster(out, r.lines, r.samples);
  return r;
}

TEST(WsLooks, WeightsOfOverlappingBurstsAddUpToOne) {
  for (double w1 : {0.0, 0.25, 0.4}) {
    const double w2 = 1.0 - 2.0 * w1;
    for (double v = -1.0; v <= 1.0; v += 0.01) {
      const double a = burst_weight(v, w1, w2), b = burst_weight(v - 1.0, w1, w2), c = burst_weight(v + 1.0, w1, w2);
      EXPECT_NEAR(a * a + b * b + c * c, 1.0, 1e-12) << "W1 " << w1 << " v " << v;
    }
  }
  EXPECT_EQ(burst_weight(0.9, 0.25, 0.5), 0.0);  // beyond W1 + W2
  EXPECT_EQ(burst_weight(0.0, -0.1, 0.5), 0.0);  // a negative W1
}

TEST(WsLooks, LookPlansAndCentres) {
  // Needed band n = (c/2 / sin(theta)) / resolution; usable 0.8 B; k = floor(1.3 u / n) made odd.
  struct Case {
    double incidence;
    int resolution;
    int looks;  // 0: refused, more than 15
  } cases[] = {{20.0, 150, 5}, {31.0, 150, 7}, {40.0, 150, 9}, {20.0, 20, 1}, {20.0, 300, 11}, {20.0, 1000, 0}};
  for (const auto& c : cases) {
    LookPlan plan;
    const int st = plan_looks(16e6, c.incidence, c.resolution, plan);
    ASSERT_EQ(st, c.looks == 0 ? 1 : 0) << c.incidence << " " << c.resolution;
    if (st != 0) continue;
    EXPECT_EQ(plan.looks, c.looks) << c.incidence << " " << c.resolution;
    EXPECT_EQ(plan.looks % 2, 1);
    ASSERT_EQ(static_cast<int>(plan.centres.size()), plan.looks);
    const auto [lo, hi] = std::minmax_element(plan.centres.begin(), plan.centres.end());
    if (plan.looks > 1) {
      EXPECT_NEAR(*hi + plan.band / 2, 8e6, 1.0);  // the outer looks reach the band's edges
      EXPECT_NEAR(*lo - plan.band / 2, -8e6, 1.0);
    }
  }
  LookPlan plan;
  EXPECT_EQ(plan_looks(16e6, 20.0, 8, plan), 0);  // a resolution finer than the band: one look
  EXPECT_EQ(plan.looks, 1);
}

TEST(WsLooks, BurstsFromRecordTimes) {
  const double dt = 1e-3;
  std::vector<double> t;
  for (int b = 0; b < 3; ++b)
    for (int l = 0; l < 5; ++l) t.push_back(100.0 + b * 3 * dt + l * dt);  // bursts overlap by two lines
  const auto bursts = find_bursts(t, dt);
  ASSERT_EQ(bursts.size(), 3u);
  EXPECT_EQ(bursts[1].firstRecord, 5);
  EXPECT_EQ(bursts[2].lines, 5);
  EXPECT_DOUBLE_EQ(bursts[2].firstTime, 100.006);
}

// Weights that would not add up to one, or that reach beyond what a burst holds (half of its 320
// lines is 0.8 of the 200-line cycle), and burst counts beyond the product are refused.
TEST(WsMultilook, RefusesWeightsAndBurstCountsItCannotHonour) {
  const auto& product = uniform_product();
  struct Case {
    double w1, w2;
    int skip, process;
    int status;
    const char* words;
  } cases[] = {
      {0.2, 0.5, 0, 0, 10, "whole number"},        // 2 W1 + W2 = 0.9: a ripple of 3 dB
      {0.3, 0.5, 0, 0, 10, "whole number"},        // 1.1
      {0.0, 1.0, 0, 0, 10, "beyond"},              // sums to one, but needs a whole cycle each side
      {0.25, 0.5, 4, 2, 10, "Bursts To Skip + Bursts To Process are greater than available bursts"},
      {0.25, 0.5, 5, 0, 10, "Bursts To Skip + Bursts To Process are greater than available bursts"},
  };
  for (const auto& c : cases) {
    WsMultilookConfig cfg;
    cfg.w1 = c.w1;
    cfg.w2 = c.w2;
    cfg.burstsToSkip = c.skip;
    cfg.burstsToProcess = c.process;
    const WsRun r = multilook(product.path, cfg);
    EXPECT_EQ(r.status, c.status) << c.w1 << " " << c.w2 << " " << c.skip << " " << c.process;
    EXPECT_NE(r.result.error.find(c.words), std::string::npos) << r.result.error;
  }
}

// The level of a uniform scene across the seams and along azimuth, and its speckle.
TEST(WsMultilook, UniformSceneIsFlatAcrossSeamsAndBursts) {
  const auto& product = uniform_product();
  const WsMultilookConfig cfg;
  const WsRun r = multilook(product.path, cfg);
  ASSERT_EQ(r.status, 0) << r.result.error;
  ASSERT_GT(r.lines, 0);
  // Lines where every sub-swath has bursts either side (not the first and last bursts' halves).
  const int firstLine = 400, lastLine = r.lines - 400;
  ASSERT_GT(lastLine - firstLine, 150);
  auto p = [&](int l, int c) {
    const double a = r.amplitude[static_cast<std::size_t>(l) * r.samples + c];
    return a * a;
  };
  double total = 0.0;
  std::size_t count = 0;
  for (int l = firstLine; l < lastLine; ++l)
    for (int c = 0; c < r.samples; ++c, ++count) total += p(l, c);
  const double mean = total / count;
  // Range: blocks of columns, each some 60 columns wide, seams included.
  const int block = 60;
  for (int c0 = 0; c0 + block <= r.samples; c0 += block) {
    double s = 0.0;
    for (int l = firstLine; l < lastLine; ++l)
      for (int c = c0; c < c0 + block; ++c) s += p(l, c);
    const double db = 10.0 * std::log10(s / ((lastLine - firstLine) * block) / mean);
    EXPECT_LT(std::fabs(db), 0.2) << "columns " << c0 << ".." << c0 + block;
  }
  // Azimuth: blocks of 20 lines (a tenth of a cycle) across the bursts' weights, in each
  // sub-swath on its own (the
  // sub-swaths' bursts come at other times of the cycle, so their sum would hide a scalloping).
  for (int s = 0; s < 5; ++s) {
    const int c0 = s * r.samples / 5 + r.samples / 20, c1 = (s + 1) * r.samples / 5 - r.samples / 20;
    double level = 0.0;
    for (int l = firstLine; l < lastLine; ++l)
      for (int c = c0; c < c1; ++c) level += p(l, c);
    level /= static_cast<double>(lastLine - firstLine) * (c1 - c0);
    for (int l0 = firstLine; l0 + 20 <= lastLine; l0 += 20) {
      double sum = 0.0;
      for (int l = l0; l < l0 + 20; ++l)
        for (int c = c0; c < c1; ++c) sum += p(l, c);
      const double db = 10.0 * std::log10(sum / (20.0 * (c1 - c0)) / level);
      EXPECT_LT(std::fabs(db), 0.2) << "sub-swath " << s + 1 << " lines " << l0;
    }
  }

  // Speckle: in the middle of each sub-swath the ENL is that of its range looks (overlapping
  // bands correlate) times the azimuth looks its burst weights give, line by line.
  const int looks = r.result.rangeLooks;
  const double cycleLines = 200.0, burstLines = 320.0;
  const int offsets[5] = {0, 40, 80, 120, 160};
  for (int s = 0; s < 5; ++s) {
    LookPlan plan;
    ASSERT_EQ(plan_looks(16e6, r.swaths[s].incidence, 150, plan), 0);
    const auto centres = look_centres(looks, plan.band, 16e6);
    // Two looks of a flat spectrum correlate by the share of band they have in common.
    double rho2 = 0.0;
    for (double a : centres)
      for (double b : centres) rho2 += std::pow(std::max(0.0, 1.0 - std::fabs(a - b) / plan.band), 2.0);
    const double rangeEnl = looks * looks / rho2;
    double inverse = 0.0, sum = 0.0, sum2 = 0.0;
    std::size_t n = 0;
    const int c0 = s * r.samples / 5 + r.samples / 20, c1 = (s + 1) * r.samples / 5 - r.samples / 20;
    for (int l = firstLine; l < lastLine; ++l) {
      double w2 = 0.0, w4 = 0.0;
      for (int b = 0; b < 5; ++b) {
        const double centre = b * cycleLines + offsets[s] + 0.5 * (burstLines - 1);
        const double w = burst_weight((l - centre) / cycleLines, cfg.w1, cfg.w2);
        w2 += w * w;
        w4 += w * w * w * w;
      }
      inverse += 1.0 / (rangeEnl * w2 * w2 / w4);
      for (int c = c0; c < c1; ++c, ++n) {
        sum += p(l, c);
        sum2 += p(l, c) * p(l, c);
      }
    }
    const double expected = (lastLine - firstLine) / inverse;
    const double m = sum / n, enl = m * m / (sum2 / n - m * m);
    EXPECT_NEAR(enl / expected, 1.0, 0.1) << "sub-swath " << s + 1 << ": ENL " << enl << ", expected " << expected;
  }
}

// A range spectrum weighted by a Hamming window (0.75, as the burst chain uses) holds less power
// in the outer looks: scaled by their share of the band alone, wide looks (near range) come out
// higher than narrow ones. On this product the level falls by 0.09 dB from SS1 to SS5 (over
// ASAR's own sub-swaths, 19 to 40 degrees, by 0.27 dB, 0.15 dB at the first seam); told the
// window, the multilooker keeps one level in all five sub-swaths (0.02 dB).
TEST(WsMultilook, WeightedRangeSpectrumKeepsOneLevelAcrossSubSwaths) {
  simulator::WssConfig c;
  c.out_dir = temp_dir("wss_weighted");
  c.orbit_path = kOrbit;
  c.samples = 1800;
  c.overlap = 120;
  c.bursts = 5;
  c.burst_lines = 320;
  c.cycle_lines = 200;
  c.range_window = 0.75;
  const auto product = simulator::write_wss_product(c);
  for (const double window : {1.0, 0.75}) {
    SCOPED_TRACE("window told " + std::to_string(window));
    const WsRun r = multilook(product.path, WsMultilookConfig{}, [&](std::array<WsSubSwath, 5>& sw) {
      for (auto& x : sw) x.rangeWindow = window;
    });
    ASSERT_EQ(r.status, 0) << r.result.error;
    // The mean level of the middle of each sub-swath, over the lines with bursts on both sides.
    std::vector<double> level;
    for (int s = 0; s < 5; ++s) {
      const int c0 = s * r.samples / 5 + r.samples / 20, c1 = (s + 1) * r.samples / 5 - r.samples / 20;
      double sum = 0.0;
      for (int l = 400; l < r.lines - 400; ++l)
        for (int col = c0; col < c1; ++col) {
          const double a = r.amplitude[static_cast<std::size_t>(l) * r.samples + col];
          sum += a * a;
        }
      level.push_back(10.0 * std::log10(sum / ((r.lines - 800.0) * (c1 - c0))));
    }
    const double spread = *std::max_element(level.begin(), level.end()) - *std::min_element(level.begin(), level.end());
    std::string text;
    for (double v : level) text += std::to_string(v - level[0]) + " ";
    RecordProperty(window == 1.0 ? "levels_db_window_untold" : "levels_db_window_told", text);
    if (window == 1.0) {
      EXPECT_GT(level[0] - level[4], 0.06);
    } else {
      EXPECT_LT(spread, 0.04);
    }
  }
}

// A target in the overlap of two sub-swaths is in both their data; the joined image shows it
// once, where its slant time puts it.
TEST(WsMultilook, TargetInAnOverlapAppearsOnceAtItsPosition) {
  simulator::WssConfig c;
  c.out_dir = temp_dir("wss_targets");
  c.orbit_path = kOrbit;
  c.samples = 400;
  c.overlap = 60;
  c.bursts = 4;
  c.clutter_std = 30.0;
  const double line = 430.0, inSs3 = 20.0;  // 20 samples into SS3, in the overlap with SS2
  c.targets = {{2, line, c.samples - c.overlap + inSs3, 30000.0}, {3, line, inSs3, 30000.0},
               {4, line, 250.0, 30000.0}};
  const auto product = simulator::write_wss_product(c);
  const WsRun r = multilook(product.path, WsMultilookConfig{});
  ASSERT_EQ(r.status, 0) << r.result.error;
  const int d = r.result.decimation;
  const double expected[2] = {(2.0 * (c.samples - c.overlap) + inSs3) / d, (3.0 * (c.samples - c.overlap) + 250.0) / d};
  // Peaks: cells that are the brightest within 8 cells and 100 times the clutter.
  std::vector<std::pair<int, int>> peaks;
  double background = 0.0;
  for (float a : r.amplitude) background += static_cast<double>(a) * a;
  background /= static_cast<double>(r.amplitude.size());
  for (int l = 8; l < r.lines - 8; ++l)
    for (int col = 8; col < r.samples - 8; ++col) {
      const float a = r.amplitude[static_cast<std::size_t>(l) * r.samples + col];
      if (static_cast<double>(a) * a < 100.0 * background) continue;
      bool highest = true;
      for (int dl = -8; dl <= 8 && highest; ++dl)
        for (int dc = -8; dc <= 8 && highest; ++dc)
          if ((dl || dc) && r.amplitude[static_cast<std::size_t>(l + dl) * r.samples + col + dc] > a) highest = false;
      if (highest) peaks.emplace_back(l, col);
    }
  ASSERT_EQ(peaks.size(), 2u);
  for (int k = 0; k < 2; ++k) {
    EXPECT_NEAR(peaks[static_cast<std::size_t>(k)].first, line, 1.0);
    EXPECT_NEAR(peaks[static_cast<std::size_t>(k)].second, expected[k], 1.0);
  }
}

// Sub-swaths that do not meet (short sampling windows, as in a small level 0 simulation): each
// keeps all its columns, those between them stay empty, and the far ones keep their level.
TEST(WsMultilook, SubSwathsThatDoNotMeetLeaveAnEmptyGap) {
  const auto& product = uniform_product();
  const WsRun joined = multilook(product.path, WsMultilookConfig{});
  ASSERT_EQ(joined.status, 0) << joined.result.error;
  const double step = joined.result.slantStep;
  const double gap = 200 * step;  // columns of the joined grid
  const WsRun r = multilook(product.path, WsMultilookConfig{}, [&](std::array<WsSubSwath, 5>& sw) {
    for (std::size_t s = 2; s < 5; ++s) sw[s].nearTime += gap;
  });
  ASSERT_EQ(r.status, 0) << r.result.error;
  ASSERT_EQ(r.samples, joined.samples + 200);
  const int d = r.result.decimation;
  const int end1 = static_cast<int>(std::lround((r.swaths[1].nearTime - r.swaths[0].nearTime) / step)) +
                   r.swaths[1].samples / d;
  const int start2 = static_cast<int>(std::lround((r.swaths[2].nearTime - r.swaths[0].nearTime) / step));
  ASSERT_GT(start2, end1);
  double near = 0.0, far = 0.0, inGap = 0.0;
  for (int l = 400; l < r.lines - 400; ++l) {
    const float* row = r.amplitude.data() + static_cast<std::size_t>(l) * r.samples;
    for (int c = end1; c < start2; ++c) inGap += row[c];
    for (int c = end1 - 40; c < end1; ++c) near += static_cast<double>(row[c]) * row[c];
    for (int c = start2; c < start2 + 40; ++c) far += static_cast<double>(row[c]) * row[c];
  }
  EXPECT_EQ(inGap, 0.0);
  // The last columns of SS2 and the first of SS3, whole on each side (no half-overlap cut).
  EXPECT_GT(near, 0.0);
  EXPECT_LT(std::fabs(10.0 * std::log10(far / near)), 0.5);
}

}  // namespace
}  // namespace sar::multilook

namespace sar::multilook {
namespace {

// Ground range: a point target measures 0.886 GrResolution across its -3 dB width (looks cut
// square to the band of GrResolution), sampled every GrSamplingStep.
TEST(WsMultilook, GroundRangeResolutionOfAPointTarget) {
  simulator::WssConfig c;
  c.out_dir = temp_dir("wss_resolution");
  c.orbit_path = kOrbit;
  c.samples = 600;
  c.overlap = 60;
  c.bursts = 4;
  c.clutter_std = 3.0;
  c.targets = {{3, 430.0, 300.0, 30000.0}};
  const auto product = simulator::write_wss_product(c);
  WsMultilookConfig cfg;
  cfg.groundRange = 1;
  const WsRun r = multilook(product.path, cfg);
  ASSERT_EQ(r.status, 0) << r.result.error;
  std::size_t peak = 0;
  for (std::size_t i = 0; i < r.amplitude.size(); ++i)
    if (r.amplitude[i] > r.amplitude[peak]) peak = i;
  const int line = static_cast<int>(peak / r.samples), column = static_cast<int>(peak % r.samples);
  // The power cut across range, interpolated finely (the detected looks are band-limited to
  // twice the look band, which the 75 m steps sample).
  const int half = 16, over = 32, n = 2 * half;
  ASSERT_GE(column - half, 0);
  ASSERT_LE(column + half, r.samples);
  std::vector<std::complex<double>> cut(n);
  for (int k = 0; k < n; ++k) {
    const double a = r.amplitude[static_cast<std::size_t>(line) * r.samples + column - half + k];
    cut[k] = a * a;
  }
  // Interpolation by the sum of shifted sincs of the samples (periodic over the cut).
  auto power_at = [&](double x) {
    double v = 0.0;
    for (int k = 0; k < n; ++k) {
      const double d = x - k;
      v += cut[k].real() * (std::fabs(d) < 1e-12 ? 1.0 : std::sin(M_PI * d) / (M_PI * d));
    }
    return v;
  };
  const double top = power_at(half);
  double left = half, right = half;
  while (left > 0 && power_at(left) > 0.5 * top) left -= 1.0 / over;
  while (right < n - 1 && power_at(right) > 0.5 * top) right += 1.0 / over;
  const double width = (right - left) * cfg.groundStep;
  EXPECT_NEAR(width, 0.886 * cfg.groundResolution, 0.05 * 0.886 * cfg.groundResolution);
}

}  // namespace
}  // namespace sar::multilook

// Azimuth focusing of range-compressed point targets made from the exact hyperbolic range
// history: each kernel, with and without squint, with range sub-blocks and azimuth blocks,
// must put every target at its zero-Doppler position on the output grid with the resolution
// that the processed band predicts.
#include <gtest/gtest.h>

#include <cmath>
#include <complex>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <vector>

#include "analyser/irf.hpp"
#include "stripmap/azimuth_focus.hpp"
#include "stripmap/range_focus.hpp"

using sar::stripmap::azimuthconf;
using sar::stripmap::procparm;
using sar::stripmap::sarpar;
using cf = std::complex<float>;

namespace {

constexpr double kPi = 3.14159265358979323846;
constexpr double kC = 299792458.0;
constexpr double kFs = 19.20768e6, kBand = 16e6, kF0 = 5.331004416e9, kPrf = 1652.4;
constexpr double kV = 7100.0, kAntenna = 10.0, kStart = 1000.0;

double sinc(double u) { return u == 0.0 ? 1.0 : std::sin(kPi * u) / (kPi * u); }

struct PointTarget {
  double line, sample;  // zero-Doppler line and the sample of its closest range, raw grid
};

struct Scene {
  sarpar par;
  procparm proc;
  azimuthconf az;
  std::vector<PointTarget> targets;
};

// Range-compressed lines of point targets: the ideal compressed pulse (band kBand) at the
// two-way time of R(t) = sqrt(R^2 + V^2 (t - t0)^2), the carrier phase -4 pi R / lambda and
// the two-way azimuth pattern of a uniform antenna steered to the centroid fd.
Scene make_scene(int lines, int samples, double fd, std::vector<PointTarget> targets) {
  Scene s;
  const double lambda = kC / kF0;
  s.par.samplingRate = kFs;
  s.par.carrierFrequency = kF0;
  s.par.prf = kPrf;
  s.par.chirp_bandwidth = kBand;
  s.par.nearRangeTime = 2.0 * 850e3 / kC;
  s.par.azimuthStartTime = kStart;
  s.par.lines = lines;
  s.par.samples = samples;
  s.proc.lines = lines;
  s.proc.rangeSamples = samples;
  s.proc.Flag_incore = 1;
  s.proc.dopplerCentroid = {fd, 0, 0, 0, 0, 0, 0, s.par.nearRangeTime, kStart};
  // Doppler rate -2 V^2 / (lambda R) as a quadratic in range time about the scene centre.
  const double tm = s.par.nearRangeTime + samples / 2.0 / kFs;
  const double k = -4.0 * kV * kV / (lambda * kC);
  s.proc.dopplerRate = {k / tm, -k / (tm * tm), 0, 0, k / (tm * tm * tm), 0, 0, tm, kStart};
  s.proc.matrix.assign(static_cast<std::size_t>(lines) * samples, cf{});
  const double sc = lambda * fd / (2.0 * kV);  // the beam points where the Doppler is fd
  for (const auto& t : targets) {
    const double R = (s.par.nearRangeTime + t.sample / kFs) * kC / 2.0;
    for (int l = 0; l < lines; ++l) {
      const double dt = (l - t.line) / kPrf;
      const double r = std::sqrt(R * R + kV * kV * dt * dt);
      const double g = sinc(kAntenna / lambda * (kV * dt / r + sc));
      const double w = g * g;
      if (w < 1e-6) continue;
      const double k0 = (2.0 * r / kC - s.par.nearRangeTime) * kFs;
      const auto phase = std::polar(w, -4.0 * kPi * r / lambda);
      for (int i = std::max(0, static_cast<int>(k0) - 96); i < std::min(samples, static_cast<int>(k0) + 96); ++i)
        s.proc.matrix[static_cast<std::size_t>(l) * samples + i] +=
            cf(phase * sinc(kBand / kFs * (i - k0)));
    }
  }
  s.targets = std::move(targets);
  s.az.AntennaLength = kAntenna;
  s.az.LinesInBlock = lines;
  s.az.SamplesInBlock = samples;
  s.az.AzimuthOverlap = 700;
  s.az.RangeOverlap = 0;
  return s;
}

// -3 dB width in lines of the azimuth response that the processed band gives: the spectrum is
// the two-way amplitude pattern over one PRF around the centroid.
double azimuth_resolution_theory() {
  const int n = 4096;
  std::vector<double> weights(n);
  for (int i = 0; i < n; ++i) {
    const double f = (i - n / 2) * kPrf / n;
    const double g = sinc(kAntenna * f / (2.0 * kV));
    weights[static_cast<std::size_t>(i)] = g * g;
  }
  auto response = [&](double x) {  // x in lines
    double re = 0.0;
    for (int i = 0; i < n; ++i) re += weights[static_cast<std::size_t>(i)] * std::cos(2 * kPi * (i - n / 2) * x / n);
    return re * re;
  };
  const double peak = response(0.0);
  double lo = 0.0, hi = 2.0;
  for (int it = 0; it < 60; ++it) {
    const double mid = 0.5 * (lo + hi);
    (response(mid) > 0.5 * peak ? lo : hi) = mid;
  }
  return 2.0 * lo;
}

void focus_and_check(Scene& s, int kernel, double tolerance) {
  s.az.PerformInterpolation = kernel;
  s.az.StoltPadding = 0.1;
  ASSERT_EQ(sar::stripmap::azimuthfoc(s.par, s.proc, s.az), 0);
  const int lines = s.proc.focusedLines, samples = s.proc.focusedSamples;
  ASSERT_GT(lines, 0);
  const double theoryAz = azimuth_resolution_theory();
  const double theoryRg = 0.886 * kFs / kBand;
  sar::analyser::ComplexImageView view{{s.proc.matrix.data(), s.proc.matrix.size()}, lines, samples, samples, 0, 0};
  sar::analyser::AnalyserOptions opt;
  for (const auto& t : s.targets) {
    // Expected place on the output grid from the stage's own annotation of it.
    const double zeroDopplerTime = kStart + t.line / kPrf;
    const double rangeTime = s.par.nearRangeTime + t.sample / kFs;
    const double line = (zeroDopplerTime - s.proc.firstLineTime) * kPrf;
    const double sample = (rangeTime - s.proc.firstSampleTime) * kFs;
    const auto m = sar::analyser::measure_point(view, line, sample, opt);
    ASSERT_TRUE(m.valid) << m.problem;
    EXPECT_NEAR(m.peak_line, line, tolerance) << "target at " << t.line << ", " << t.sample;
    EXPECT_NEAR(m.peak_sample, sample, tolerance) << "target at " << t.line << ", " << t.sample;
    EXPECT_NEAR(m.res_rg_px, theoryRg, 0.10 * theoryRg);
    EXPECT_NEAR(m.res_az_px, theoryAz, 0.10 * theoryAz);
    EXPECT_LT(m.pslr_rg_db, -12.0);
    EXPECT_LT(m.pslr_az_db, -12.0);
  }
}

}  // namespace

TEST(AzimuthFocus, KernelsPlaceTargetsAtZeroDoppler) {
  struct Case {
    int kernel;
    double fd;
    int subSamples, overlap;
  };
  for (const Case c : {Case{0, 0.0, 512, 0}, Case{1, 0.0, 512, 0}, Case{2, 0.0, 512, 0}, Case{1, 300.0, 512, 0},
                       Case{0, -250.0, 512, 0}, Case{1, 0.0, 256, 64}, Case{4, 0.0, 256, 64}}) {
    SCOPED_TRACE(testing::Message() << "kernel " << c.kernel << " fd " << c.fd << " sub-block " << c.subSamples);
    Scene s = make_scene(2048, 512, c.fd, {{1024.0, 200.0}, {980.3, 351.6}});
    s.az.SamplesInBlock = c.subSamples;
    s.az.RangeOverlap = c.overlap / 2;
    focus_and_check(s, c.kernel, 0.1);
  }
}

// A centroid beyond half the PRF: the echoes of a target lie some 900 lines before its
// zero-Doppler line, so the azimuth overlap must hold both the aperture and that offset.
TEST(AzimuthFocus, CentroidBeyondHalfThePrf) {
  for (const int kernel : {0, 1, 4}) {
    SCOPED_TRACE(testing::Message() << "kernel " << kernel);
    Scene s = make_scene(4096, 384, 1200.0, {{2048.0, 150.0}, {2010.3, 251.6}});
    s.az.AzimuthOverlap = 1600;
    s.az.SamplesInBlock = 256;
    s.az.RangeOverlap = 32;
    focus_and_check(s, kernel, 0.1);
  }
}

// Several azimuth blocks with a short last one: file mode (range file in, SLC out) and core
// mode give the same samples, and every focused line is there once.
TEST(AzimuthFocus, FileModeEqualsCoreModeOverSeveralBlocks) {
  namespace fs = std::filesystem;
  Scene core = make_scene(2048, 256, 150.0, {{1024.0, 100.0}});
  core.az.AzimuthOverlap = 600;
  core.az.LinesInBlock = 1400;
  core.az.PerformInterpolation = 1;
  Scene file = core;
  const fs::path dir = fs::path(testing::TempDir()) / "azimuthfoc_modes";
  fs::create_directories(dir);
  file.par.rgfPath = (dir / "EXTR.rgf").string();
  file.par.slcPath = (dir / "SLC").string();
  file.proc.Flag_incore = 0;
  {
    std::ofstream out(file.par.rgfPath, std::ios::binary);
    out.write(reinterpret_cast<const char*>(file.proc.matrix.data()),
              static_cast<std::streamsize>(file.proc.matrix.size() * sizeof(cf)));
  }
  file.proc.matrix = {};
  ASSERT_EQ(sar::stripmap::azimuthfoc(core.par, core.proc, core.az), 0);
  ASSERT_EQ(sar::stripmap::azimuthfoc(file.par, file.proc, file.az), 0);
  // The blocks hold each output line's aperture: at least the configured overlap around the
  // output, more where the aperture needs it, and several blocks.
  EXPECT_LE(core.proc.focusedLines, 2048 - 1200);
  EXPECT_GT(core.proc.focusedLines, 400);
  EXPECT_GT(sar::stripmap::block_counters().total, 1);
  EXPECT_EQ(file.proc.focusedLines, core.proc.focusedLines);
  ASSERT_EQ(fs::file_size(file.par.slcPath), core.proc.matrix.size() * sizeof(cf));
  std::vector<cf> slc(core.proc.matrix.size());
  std::ifstream in(file.par.slcPath, std::ios::binary);
  in.read(reinterpret_cast<char*>(slc.data()), static_cast<std::streamsize>(slc.size() * sizeof(cf)));
  EXPECT_EQ(0, std::memcmp(slc.data(), core.proc.matrix.data(), slc.size() * sizeof(cf)));
  EXPECT_FALSE(fs::exists(file.par.slcPath + ".part"));
}

// A last block of 1479 lines (3 x 17 x 29) is transformed padded with zero lines: a target
// whose output falls in it is focused as well as one in the first block.
TEST(AzimuthFocus, LastBlockOfAwkwardLengthFocusesItsTargets) {
  for (const int kernel : {0, 1}) {
    SCOPED_TRACE(testing::Message() << "kernel " << kernel);
    Scene s = make_scene(2503, 256, 0.0, {{900.0, 100.0}, {1750.0, 180.0}});
    s.az.LinesInBlock = 1600;
    s.az.AzimuthOverlap = 300;
    s.az.SamplesInBlock = 256;
    focus_and_check(s, kernel, 0.1);
    EXPECT_EQ(sar::stripmap::block_counters().total, 3);
    // Away from the targets' rows and columns the image is dark: the padding holds no data.
    const int lines = s.proc.focusedLines, samples = s.proc.focusedSamples;
    double peak = 0.0, background = 0.0;
    for (int l = 0; l < lines; ++l)
      for (int i = 0; i < samples; ++i) {
        const double p = std::norm(s.proc.matrix[static_cast<std::size_t>(l) * samples + i]);
        bool near = false;
        for (const auto& t : s.targets) {
          const double tl = (kStart + t.line / kPrf - s.proc.firstLineTime) * kPrf;
          const double ts = (s.par.nearRangeTime + t.sample / kFs - s.proc.firstSampleTime) * kFs;
          near = near || std::abs(l - tl) < 24 || std::abs(i - ts) < 24;
        }
        (near ? peak : background) = std::max(near ? peak : background, p);
      }
    EXPECT_LT(10.0 * std::log10(background / peak), -50.0);
  }
}

TEST(AzimuthFocus, RefusesBlocksThatDoNotFit) {
  struct Case {
    int linesInBlock, azimuthOverlap, samplesInBlock, rangeOverlap;
  };
  for (const Case c : {Case{700, 700, 256, 0}, Case{1400, 1400, 256, 0}, Case{1024, 0, 64, 70}}) {
    Scene s = make_scene(1024, 128, 0.0, {});
    s.az.LinesInBlock = c.linesInBlock;
    s.az.AzimuthOverlap = c.azimuthOverlap / 2;
    s.az.SamplesInBlock = c.samplesInBlock;
    s.az.RangeOverlap = c.rangeOverlap / 2;
    EXPECT_EQ(sar::stripmap::azimuthfoc(s.par, s.proc, s.az), 10) << c.linesInBlock << " " << c.azimuthOverlap;
  }
}

// A block longer than the scene focuses the scene as one block: the same bytes as a block of
// exactly the scene's lines.
TEST(AzimuthFocus, BlockLongerThanTheSceneIsTheWholeScene) {
  std::vector<cf> slc[2];
  int k = 0;
  for (const int linesInBlock : {1024, 4096}) {
    Scene s = make_scene(1024, 128, 0.0, {});
    s.az.LinesInBlock = linesInBlock;
    s.az.AzimuthOverlap = 350;
    s.az.SamplesInBlock = 128;
    s.az.RangeOverlap = 0;
    ASSERT_EQ(sar::stripmap::azimuthfoc(s.par, s.proc, s.az), 0) << linesInBlock;
    EXPECT_EQ(s.proc.focusedLines, 1024 - 700);
    slc[k++] = std::vector<cf>(s.proc.matrix.begin(), s.proc.matrix.end());
  }
  ASSERT_EQ(slc[0].size(), slc[1].size());
  EXPECT_EQ(0, std::memcmp(slc[0].data(), slc[1].data(), slc[0].size() * sizeof(cf)));
}

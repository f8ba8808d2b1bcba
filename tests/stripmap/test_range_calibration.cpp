// Range antenna calibration: the gain vector's pattern interpolation and geometry terms, and a
// simulated uniform scene that comes out flat in power, in core and in file mode alike.
#include <gtest/gtest.h>
#include <unistd.h>

#include <cmath>
#include <complex>
#include <cstdio>
#include <filesystem>
#include <fstream>

#include "stripmap/range_calibration.hpp"

namespace sar::stripmap {
namespace {

constexpr double kDeg = 0.017453292519943295;

procparm with_pattern() {
  procparm p;
  // Amplitude pattern over -5 .. +5 degrees around 20 degrees, 1 degree apart.
  for (int k = -5; k <= 5; ++k) p.pattern.push_back(static_cast<float>(std::exp(-0.02 * k * k)));
  p.patternLength = static_cast<int32_t>(p.pattern.size());
  p.patternCentre = 20.0;
  p.patternStep = 1.0;
  return p;
}

TEST(RangeCalibration, PatternOnGridBetweenAndBeyond) {
  const procparm p = with_pattern();
  const double fs = 1.0;
  struct Case {
    double degrees;
    double expected;  // 1 / pattern amplitude
  } cases[] = {
      {22.0, 1.0 / p.pattern[7]},                                          // on a grid point
      {22.25, 1.0 / (0.75 * p.pattern[7] + 0.25 * p.pattern[8])},          // between two
      {27.0, 1.0 / (p.pattern[10] + 2.0 * (p.pattern[10] - p.pattern[9]))},  // beyond the end
      {13.0, 1.0 / (p.pattern[0] - 2.0 * (p.pattern[1] - p.pattern[0]))},    // before the start
  };
  for (const auto& c : cases) {
    const double coeff[5] = {c.degrees * kDeg, 0, 0, 0, 0};
    double out[1];
    ASSERT_EQ(InterpRgAnt(p, coeff, fs, out), 0);
    EXPECT_NEAR(out[0], c.expected, 1e-6 * c.expected) << c.degrees;
  }
  double out[3];
  const double coeff[5] = {0.3, 0.0, 0.0, 0.0, 0.0};
  ASSERT_EQ(IncidCompCoeff(coeff, 10.0, out, 0.5), 0);
  EXPECT_DOUBLE_EQ(out[0], std::sqrt(std::sin(0.3)));  // t = 0: the range term is 1
  EXPECT_DOUBLE_EQ(out[2], std::pow(1.0 + 0.2 / 0.5, 1.5) * std::sqrt(std::sin(0.3)));
}

// A uniform scene seen through the pattern, the range spreading and the ground cell's area,
// P_r ~ P(look)^2 sigma0 / (R^3 sin(incidence)), is flat after the gain, in power.
TEST(RangeCalibration, UniformSceneComesOutFlat) {
  procparm p = with_pattern();
  metadata::sarpar par;
  par.samplingRate = 19.2e6;
  par.nearRangeTime = 5.6e-3;
  const int samples = 6000, lines = 10;
  // Look angle from 17 to 23 degrees across the swath, incidence 3 degrees more.
  const double span = samples / par.samplingRate;
  p.lookAngle = {17.0, 6.0 / span, 0, 0, 0, 0, 0, 0, 0};
  p.incidenceAngle = {20.0, 6.0 / span, 0, 0, 0, 0, 0, 0, 0};
  p.rangeSamples = samples;
  p.lines = lines;
  p.Azblk = 4;  // blocks of 4, 4 and 2 lines in file mode
  std::vector<std::complex<float>> scene(static_cast<std::size_t>(lines) * samples);
  for (int l = 0; l < lines; ++l)
    for (int i = 0; i < samples; ++i) {
      const double t = i / par.samplingRate;
      const double look = 17.0 + 6.0 * t / span, incidence = look + 3.0;
      // The antenna's amplitude pattern, as its table samples it (linear between entries).
      const double g = look - 15.0;  // entry index
      const int k = std::min(9, static_cast<int>(std::floor(g)));
      const double pattern = p.pattern[k] + (g - k) * (p.pattern[k + 1] - p.pattern[k]);
      const double power = pattern * pattern / (std::pow(1.0 + t / par.nearRangeTime, 3.0) * std::sin(incidence * kDeg));
      scene[static_cast<std::size_t>(l) * samples + i] = std::polar(static_cast<float>(std::sqrt(power)), 0.1f * i);
    }

  // Core mode.
  p.Flag_incore = 1;
  p.matrix.assign(scene.begin(), scene.end());
  ASSERT_EQ(range_antenna_calibration(par, p), 0);
  double lo = 1e300, hi = 0.0;
  for (std::size_t k = 0; k < scene.size(); ++k) {
    lo = std::min(lo, static_cast<double>(std::norm(p.matrix[k])));
    hi = std::max(hi, static_cast<double>(std::norm(p.matrix[k])));
  }
  // Across the swath the pattern alone spans 0.6 dB, the incidence 1.1 dB and the range
  // spreading 0.7 dB; what is left is rounding.
  EXPECT_LT(10.0 * std::log10(hi / lo), 0.01);

  // File mode gives the same samples.
  const auto path = std::filesystem::temp_directory_path() / ("sar_rgf_" + std::to_string(::getpid()));
  {
    std::ofstream out(path, std::ios::binary);
    out.write(reinterpret_cast<const char*>(scene.data()), static_cast<std::streamsize>(scene.size() * 8));
  }
  par.rgfPath = path.string();
  p.Flag_incore = 0;
  ASSERT_EQ(range_antenna_calibration(par, p), 0);
  std::vector<std::complex<float>> fromFile(scene.size());
  {
    std::ifstream in(path, std::ios::binary);
    in.read(reinterpret_cast<char*>(fromFile.data()), static_cast<std::streamsize>(fromFile.size() * 8));
  }
  std::filesystem::remove(path);
  for (std::size_t k = 0; k < scene.size(); ++k) ASSERT_EQ(fromFile[k], p.matrix[k]) << k;
}

TEST(RangeCalibration, MissingPatternIsRefused) {
  procparm p;
  metadata::sarpar par;
  par.samplingRate = 19.2e6;
  par.nearRangeTime = 5.6e-3;
  p.rangeSamples = 10;
  p.lines = 1;
  p.Flag_incore = 1;
  p.matrix.resize(10);
  EXPECT_EQ(range_antenna_calibration(par, p), 10);
}

}  // namespace
}  // namespace sar::stripmap

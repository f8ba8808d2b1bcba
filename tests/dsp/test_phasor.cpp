// The kernels' unit phasor against the library's: exact quarter turns, the ends of the reduced
// interval, the phases azimuth focusing produces (up to about 1e6 rad) and the fallback beyond.
#include <gtest/gtest.h>

#include <cmath>
#include <limits>
#include <random>

#include "dsp/phasor.hpp"

namespace {

constexpr double kPi = 3.14159265358979323846;

void expect_close(double phase, double weight) {
  const std::complex<double> got = sar::dsp::phasor(phase, weight);
  const std::complex<double> want = std::polar(weight, phase);
  const double tolerance = 1e-15 * std::max(1.0, std::abs(weight));
  EXPECT_NEAR(got.real(), want.real(), tolerance) << phase;
  EXPECT_NEAR(got.imag(), want.imag(), tolerance) << phase;
}

}  // namespace

TEST(Phasor, MatchesTheLibraryOverTheKernelsRange) {
  for (double phase : {0.0, -0.0, kPi / 4, -kPi / 4, kPi / 4 + 1e-12, kPi / 2, kPi, -kPi, 1.5 * kPi, 2 * kPi,
                       100.0 * kPi + 0.3, 8.2e5, -8.2e5, 8.2e5 + kPi / 4})
    expect_close(phase, 1.0);
  std::mt19937_64 gen(7);
  std::uniform_real_distribution<double> big(-1.6e6, 1.6e6), small(-10.0, 10.0), w(0.0, 3.0);
  for (int i = 0; i < 200000; ++i) expect_close(i % 2 ? big(gen) : small(gen), w(gen));
}

TEST(Phasor, FallsBackBeyondTheExactReduction) {
  for (double phase : {1e7, -3e9, 1e15}) expect_close(phase, 2.0);
  const auto nan = sar::dsp::phasor(std::numeric_limits<double>::quiet_NaN());
  EXPECT_TRUE(std::isnan(nan.real()) && std::isnan(nan.imag()));
  const auto inf = sar::dsp::phasor(std::numeric_limits<double>::infinity());
  EXPECT_TRUE(std::isnan(inf.real()) && std::isnan(inf.imag()));
}

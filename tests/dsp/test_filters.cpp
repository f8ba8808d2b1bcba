#include <gtest/gtest.h>

#include <cmath>
#include <complex>
#include <numbers>
#include <random>
#include <vector>

#include "dsp/filters.hpp"

namespace sar::dsp {
namespace {

using cd = std::complex<double>;
constexpr double kPi = std::numbers::pi;

// A band-limited sequence: tones with random amplitudes and phases spread over |f| < half
// of `band` cycles per sample around `centre`. value(t) is exact at any real t.
struct BandSignal {
  std::vector<double> f;
  std::vector<cd> c;
  BandSignal(double centre, double band, unsigned seed) {
    std::mt19937 gen(seed);
    std::uniform_real_distribution<double> u(-0.5, 0.5), ph(0, 2 * kPi);
    for (int k = 0; k < 24; ++k) {
      f.push_back(centre + band * u(gen));
      c.push_back(std::polar(0.5 + u(gen), ph(gen)));
    }
  }
  cd value(double t) const {
    cd s = 0;
    for (std::size_t k = 0; k < f.size(); ++k) s += c[k] * std::polar(1.0, 2 * kPi * f[k] * t);
    return s;
  }
};

// RMS error of a filter that should give x(p + offset) from x[p + t - n], over 200 points,
// relative to the signal's RMS.
template <class Taps>
double interpolation_error(const BandSignal& sig, const Taps& taps, int N, double offset, cd post = 1.0) {
  const int n = (N - 1) / 2;
  double err = 0, pow = 0;
  for (int p = 0; p < 200; ++p) {
    cd est = 0;
    for (int t = 0; t < N; ++t) est += sig.value(p + t - n) * cd(taps[static_cast<std::size_t>(t)]);
    const cd truth = sig.value(p + offset);
    err += std::norm(est * post - truth);
    pow += std::norm(truth);
  }
  return std::sqrt(err / pow);
}

// Row r of the bank interpolates at +(r - 50)/100. The band centred on half the sampling
// rate is filled to 90 % of B = 0.8; 17 taps then reach a least-squares error of about 7e-4
// at offsets near +-0.5 (exactly 0 at offset 0), while a bank mirrored in its offset is off by
// more than the signal itself (0.6 to 1.6) at |offset| >= 0.3.
TEST(MakeGLS, RowsInterpolateAtTheirOffsetOfBothSigns) {
  const int N = 17, P = 101;
  const double B = 0.8;
  std::vector<fcomplex> table(static_cast<std::size_t>(N * P));
  ASSERT_EQ(MakeGLS(table, N, P, B), 0);
  const BandSignal sig(-0.5, 0.9 * B, 42);
  for (int r : {0, 5, 20, 38, 50, 62, 80, 95, 100}) {
    const double offset = (r - 50) / 100.0;
    const std::span<const fcomplex> row(table.data() + r * N, N);
    const double e = interpolation_error(sig, row, N, offset);
    EXPECT_LT(e, 2e-3) << "row " << r << " offset " << offset;
    if (std::fabs(offset) >= 0.3) {
      EXPECT_GT(interpolation_error(sig, row, N, -offset), 0.5) << "row " << r << " is not mirrored";
    }
  }
}

TEST(MakeGLS, CentreRowNearUnitImpulseForFullBand) {
  const int N = 9, P = 101;
  std::vector<fcomplex> table(static_cast<std::size_t>(N * P));
  ASSERT_EQ(MakeGLS(table, N, P, 0.999), 0);
  for (int t = 0; t < N; ++t) {
    const double mag = std::abs(table[static_cast<std::size_t>(50 * N + t)]);
    EXPECT_NEAR(mag, t == 4 ? 1.0 : 0.0, 1e-2) << t;
  }
}

// Baseband bank: once the row's own carrier phase exp(-j pi x_r) is taken off, each row
// interpolates a baseband signal at its offset.
TEST(MakeGLS, LowpassBankAtBaseband) {
  const int N = 13, P = 21;
  const double B = 0.7;
  std::vector<fcomplex> table(static_cast<std::size_t>(N * P));
  ASSERT_EQ(MakeGLSlowpass(table, N, P, B), 0);
  const BandSignal sig(0.0, 0.9 * B, 7);
  for (int r : {0, 4, 10, 16, 20}) {
    const double offset = -0.5 + r / 20.0;
    const std::span<const fcomplex> row(table.data() + r * N, N);
    EXPECT_LT(interpolation_error(sig, row, N, offset, std::polar(1.0, kPi * offset)), 5e-3) << "row " << r;
  }
}

TEST(MakeGLS, RejectedShapes) {
  std::vector<fcomplex> table(1000);
  EXPECT_EQ(MakeGLS(table, 8, 101, 0.8), 10);   // even taps
  EXPECT_EQ(MakeGLS(table, 9, 1, 0.8), 10);     // one position has no spacing
  EXPECT_EQ(MakeGLS(table, 9, 101, 0.0), 10);   // no band
  EXPECT_EQ(MakeGLSlowpass(table, 9, 101, 1.5), 10);
  EXPECT_THROW(MakeGLS(table, 11, 101, 0.8), std::invalid_argument);
}

// The ScanSAR kernels: 31 and 13 taps, band 0.8 with a guard of 0.15, interpolating baseband
// signals at shifts of both signs; the taps sum to 1. The Toeplitz side also asks for
// suppression of the band around half the sampling rate, which costs in-band accuracy:
// 13 taps reach about 3e-2 at half-sample shifts, 31 taps about 2.5e-3. A shift of the wrong
// sign is off by order 1.
TEST(GlsF, InterpolatesInBandAtShifts) {
  const BandSignal sig(0.0, 0.9 * 0.8, 3);
  for (int N : {13, 31}) {
    for (double shift : {-0.5, -0.37, 0.0, 0.21, 0.49}) {
      std::vector<float> taps(static_cast<std::size_t>(N));
      ASSERT_EQ(glsF(taps, N, shift, 0.8, 0.15), 0);
      double sum = 0;
      for (float v : taps) sum += v;
      EXPECT_NEAR(sum, 1.0, 1e-6);
      EXPECT_LT(interpolation_error(sig, taps, N, shift), N == 13 ? 4e-2 : 4e-3) << N << " taps, shift " << shift;
      std::vector<fcomplex> ctaps(static_cast<std::size_t>(N));
      ASSERT_EQ(glsFcomplex(ctaps, N, shift, 0.8, 0.15), 0);
      for (int i = 0; i < N; ++i) {
        EXPECT_EQ(ctaps[static_cast<std::size_t>(i)].real(), taps[static_cast<std::size_t>(i)]);
        EXPECT_EQ(ctaps[static_cast<std::size_t>(i)].imag(), 0.0f);
      }
    }
  }
}

// |H(f)| of real taps.
double magnitude(const std::vector<fcomplex>& h, double f) {
  cd s = 0;
  for (std::size_t k = 0; k < h.size(); ++k) s += cd(h[k].real()) * std::polar(1.0, -2 * kPi * f * static_cast<double>(k));
  return std::abs(s);
}

struct LowPass {
  int N;
  double pass, stop, wPass, wStop, maxRipple;
};

// The measured response meets the band it was designed for: equiripple, with pass and stop
// deviations in the inverse ratio of their weights, and ripples no larger than the length
// buys (Kaiser's estimate for these lengths and transition widths, with margin).
TEST(Remez, LowPassMeetsItsBands) {
  const LowPass table[] = {
      {51, 0.10, 0.15, 1.0, 1.0, 5e-3},
      {51, 0.10, 0.15, 1.0, 10.0, 2e-2},
      {40, 0.20, 0.27, 1.0, 1.0, 1e-2},
      {31, 0.25, 0.35, 2.0, 1.0, 1e-2},
  };
  for (const LowPass& c : table) {
    std::vector<fcomplex> h(static_cast<std::size_t>(c.N));
    const double bands[] = {0.0, c.pass, c.stop, 0.5};
    const double desired[] = {1.0, 0.0};
    const double weights[] = {c.wPass, c.wStop};
    ASSERT_EQ(remezOBX(h, c.N, 2, bands, desired, weights), 0);
    for (int i = 0; i < c.N; ++i) {
      EXPECT_EQ(h[static_cast<std::size_t>(i)].imag(), 0.0f);
      EXPECT_NEAR(h[static_cast<std::size_t>(i)].real(), h[static_cast<std::size_t>(c.N - 1 - i)].real(), 1e-6);
    }
    double dPass = 0, dStop = 0;
    for (int k = 0; k <= 4000; ++k) {
      const double f = 0.5 * k / 4000;
      const double m = magnitude(h, f);
      if (f <= c.pass) dPass = std::max(dPass, std::fabs(m - 1.0));
      if (f >= c.stop) dStop = std::max(dStop, m);
    }
    EXPECT_LT(dPass, c.maxRipple) << c.N;
    EXPECT_LT(dStop, c.maxRipple) << c.N;
    EXPECT_NEAR((dPass * c.wPass) / (dStop * c.wStop), 1.0, 0.05) << c.N << " pass " << dPass << " stop " << dStop;
  }
}

TEST(Remez, BandPassAndRejectedDesigns) {
  std::vector<fcomplex> h(61);
  const double bands[] = {0.0, 0.08, 0.12, 0.25, 0.3, 0.5};
  const double desired[] = {0.0, 1.0, 0.0};
  const double weights[] = {1.0, 1.0, 1.0};
  ASSERT_EQ(remezOBX(h, 61, 3, bands, desired, weights), 0);
  EXPECT_NEAR(magnitude(h, 0.18), 1.0, 0.02);
  EXPECT_LT(magnitude(h, 0.0), 0.02);
  EXPECT_LT(magnitude(h, 0.4), 0.02);

  const double bad[] = {0.0, 0.3, 0.2, 0.5};
  const double over[] = {0.0, 0.2, 0.3, 0.6};
  const double two[] = {1.0, 0.0};
  const double zero[] = {1.0, 0.0};
  const double ok[] = {0.0, 0.2, 0.3, 0.5};
  EXPECT_EQ(remezOBX(h, 2, 2, ok, two, two), 10);
  EXPECT_EQ(remezOBX(h, 21, 2, bad, two, weights), 10);
  EXPECT_EQ(remezOBX(h, 21, 2, over, two, weights), 10);
  EXPECT_EQ(remezOBX(h, 21, 2, ok, two, zero), 10);
  EXPECT_EQ(remezOBX(h, 21, 3, ok, two, weights), 10);
  EXPECT_THROW(remezOBX(h, 99, 2, ok, two, weights), std::invalid_argument);
}

}  // namespace
}  // namespace sar::dsp

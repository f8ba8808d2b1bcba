// The kernels' vector sine and cosine against the library's, over the phases azimuth focusing
// produces (up to about 1e6 rad), and the rotation of float samples built on it.
#include <gtest/gtest.h>

#include <cmath>
#include <complex>
#include <random>
#include <vector>

#include "dsp/vsincos.hpp"

namespace {

using sar::dsp::fcomplex;

TEST(VectorSinCos, MatchesTheLibraryAtEveryLengthAndPhase) {
  std::mt19937_64 gen(11);
  std::uniform_real_distribution<double> big(-1.6e6, 1.6e6), small(-10.0, 10.0);
  // Lengths around the vector widths, so that every tail path runs.
  for (std::size_t n : {1u, 2u, 3u, 4u, 5u, 7u, 8u, 9u, 1000u, 4099u}) {
    std::vector<double> phase(n), s(n), c(n);
    for (std::size_t i = 0; i < n; ++i) phase[i] = i % 3 ? big(gen) : small(gen);
    if (n >= 4) phase[1] = 0.0, phase[2] = 3.14159265358979323846 / 2, phase[3] = -1e-300;
    sar::dsp::sincos_n(phase, s, c);
    std::vector<double> s2(n), c2(n);
    // The baseline path too, which this machine may not choose.
    sar::dsp::detail::sincos_sse2(phase.data(), s2.data(), c2.data(), n);
    for (std::size_t i = 0; i < n; ++i) {
      EXPECT_NEAR(s[i], std::sin(phase[i]), 1e-15) << sar::dsp::sincos_path() << " n " << n << " phase " << phase[i];
      EXPECT_NEAR(c[i], std::cos(phase[i]), 1e-15) << sar::dsp::sincos_path() << " n " << n << " phase " << phase[i];
      EXPECT_NEAR(s2[i], std::sin(phase[i]), 1e-15) << "sse2 n " << n << " phase " << phase[i];
      EXPECT_NEAR(c2[i], std::cos(phase[i]), 1e-15) << "sse2 n " << n << " phase " << phase[i];
    }
  }
}

TEST(VectorSinCos, ResultDoesNotDependOnThePositionInTheArray) {
  // A phase gives the same bytes in a vector lane and in the tail: the kernels cut lines into
  // spans that differ with the block, and the focused bytes must not.
  const std::vector<double> phase = {0.3, 1e5 + 0.7, -2.5, 8.2e5, 4.4, -0.01, 7.0};
  std::vector<double> s(phase.size()), c(phase.size());
  sar::dsp::sincos_n(phase, s, c);
  for (std::size_t i = 0; i < phase.size(); ++i) {
    double s1 = 0.0, c1 = 0.0;
    sar::dsp::sincos_n(std::span<const double>(&phase[i], 1), std::span<double>(&s1, 1), std::span<double>(&c1, 1));
    EXPECT_EQ(s1, s[i]) << i;
    EXPECT_EQ(c1, c[i]) << i;
  }
}

TEST(VectorSinCos, RotatesSamplesWithAndWithoutWeights) {
  const std::size_t n = 301;
  std::vector<fcomplex> x(n), y(n);
  std::vector<double> phase(n), weight(n);
  for (std::size_t i = 0; i < n; ++i) {
    x[i] = fcomplex(static_cast<float>(1.0 + 0.01 * i), static_cast<float>(-0.5 + 0.003 * i));
    phase[i] = 0.37 * static_cast<double>(i * i) - 40.0;
    weight[i] = 0.5 + 0.001 * static_cast<double>(i);
  }
  y = x;
  sar::dsp::rotate_n(y, phase);
  std::vector<fcomplex> z = x;
  sar::dsp::rotate_n(z, phase, weight);
  for (std::size_t i = 0; i < n; ++i) {
    const std::complex<double> want = std::complex<double>(x[i]) * std::polar(1.0, phase[i]);
    EXPECT_NEAR(y[i].real(), want.real(), 1e-6) << i;
    EXPECT_NEAR(y[i].imag(), want.imag(), 1e-6) << i;
    EXPECT_NEAR(z[i].real(), weight[i] * want.real(), 1e-6) << i;
    EXPECT_NEAR(z[i].imag(), weight[i] * want.imag(), 1e-6) << i;
  }
  // The same turn from phasors made beforehand.
  std::vector<std::complex<double>> phasor(n);
  for (std::size_t i = 0; i < n; ++i) phasor[i] = std::polar(weight[i], phase[i]);
  std::vector<fcomplex> t = x;
  sar::dsp::rotate_by(t, phasor);
  for (std::size_t i = 0; i < n; ++i) EXPECT_NEAR(std::abs(std::complex<double>(t[i]) - std::complex<double>(z[i])), 0.0, 2e-6) << i;
  EXPECT_THROW(sar::dsp::rotate_by(t, std::span<const std::complex<double>>(phasor.data(), n - 1)), std::invalid_argument);
  std::vector<double> shortWeight(n - 1, 1.0);
  EXPECT_THROW(sar::dsp::rotate_n(y, phase, shortWeight), std::invalid_argument);
  EXPECT_THROW(sar::dsp::rotate_n(y, std::span<const double>(phase.data(), n - 1)), std::invalid_argument);
}

}  // namespace

namespace {

// The vector rotation gives the bytes of the scalar formula on the same sines and cosines, in
// the vector steps and in the tail, so that no sample's result depends on its place in a line.
TEST(VectorSinCos, VectorRotationEqualsTheScalarFormulaBitForBit) {
  const std::size_t n = 263;
  std::vector<fcomplex> x(n);
  std::vector<double> phase(n), weight(n), s(n), c(n);
  for (std::size_t i = 0; i < n; ++i) {
    x[i] = fcomplex(std::sin(0.7 * i) * 1e3f, std::cos(1.3 * i) * 1e-2f);
    phase[i] = 1e4 * std::sin(0.01 * static_cast<double>(i * i));
    weight[i] = 1.0 / (1.0 + 0.01 * static_cast<double>(i));
  }
  // The path this machine chose, then the baseline path on its own sines and cosines.
  for (const bool baseline : {false, true}) {
    if (baseline)
      sar::dsp::detail::sincos_sse2(phase.data(), s.data(), c.data(), n);
    else
      sar::dsp::sincos_n(phase, s, c);
    for (const bool weighted : {false, true}) {
      std::vector<fcomplex> y = x;
      const double* w = weighted ? weight.data() : nullptr;
      if (baseline)
        sar::dsp::detail::rotate_sse2(y.data(), phase.data(), w, n);
      else
        sar::dsp::rotate_n(y, phase, weighted ? std::span<const double>(weight) : std::span<const double>());
      for (std::size_t i = 0; i < n; ++i) {
        const double pc = weighted ? weight[i] * c[i] : c[i], ps = weighted ? weight[i] * s[i] : s[i];
        const double re = x[i].real(), im = x[i].imag();
        const fcomplex want(static_cast<float>(re * pc - im * ps), static_cast<float>(re * ps + im * pc));
        ASSERT_EQ(y[i], want) << "sample " << i << (weighted ? " weighted" : "") << (baseline ? " sse2" : "");
      }
    }
  }
}

}  // namespace

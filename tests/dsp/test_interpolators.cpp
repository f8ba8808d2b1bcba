#include <gtest/gtest.h>

#include <Eigen/Dense>
#include <cmath>
#include <complex>
#include <numbers>
#include <random>
#include <vector>

#include "dsp/interpolators.hpp"

namespace sar::dsp {
namespace {

using cd = std::complex<double>;
constexpr double kPi = std::numbers::pi;

// A periodic band-limited sequence of n samples: tones at k/n cycles per sample, |k| < n/2,
// plus for even n a cosine at the Nyquist frequency. value(t) is exact at any real t.
struct Periodic {
  int n;
  std::vector<int> k;
  std::vector<cd> c;
  double nyquist = 0.0;
  Periodic(int n_, unsigned seed) : n(n_) {
    std::mt19937 gen(seed);
    std::uniform_real_distribution<double> u(-1.0, 1.0);
    for (int i = 0; i < 6; ++i) {
      k.push_back(static_cast<int>(std::lround(u(gen) * ((n - 1) / 2))));
      c.push_back({u(gen), u(gen)});
    }
    if (n % 2 == 0) nyquist = 0.7;
  }
  cd value(double t) const {
    cd s = nyquist * std::cos(kPi * t);
    for (std::size_t i = 0; i < k.size(); ++i) s += c[i] * std::polar(1.0, 2 * kPi * k[i] * t / n);
    return s;
  }
};

TEST(Interpft, ReproducesBandLimitedSequencesAlongRowsAndColumns) {
  for (const int n : {15, 16}) {
    const int n2 = 3 * n + 1;
    const int other = 3;
    Periodic sig[3] = {Periodic(n, 1), Periodic(n, 2), Periodic(n, 3)};
    interp it;
    // Along rows: `other` rows of n samples.
    std::vector<fcomplex> in(static_cast<std::size_t>(other * n)), out(static_cast<std::size_t>(other * n2));
    for (int r = 0; r < other; ++r)
      for (int t = 0; t < n; ++t) in[static_cast<std::size_t>(r * n + t)] = fcomplex(sig[r].value(t));
    ASSERT_EQ(it.interpft(in, other, n, other, n2, out), 0);
    double worst = 0.0;
    for (int r = 0; r < other; ++r)
      for (int j = 0; j < n2; ++j)
        worst = std::max(worst, std::abs(cd(out[static_cast<std::size_t>(r * n2 + j)]) - sig[r].value(static_cast<double>(j) * n / n2)));
    EXPECT_LT(worst, 2e-5) << n;
    // Along columns: n rows of `other` samples.
    std::vector<fcomplex> inT(static_cast<std::size_t>(n * other)), outT(static_cast<std::size_t>(n2 * other));
    for (int r = 0; r < other; ++r)
      for (int t = 0; t < n; ++t) inT[static_cast<std::size_t>(t * other + r)] = fcomplex(sig[r].value(t));
    ASSERT_EQ(it.setplans(n, other, n2, other), 0);
    ASSERT_EQ(it.interpft_p(inT, outT), 0);
    worst = 0.0;
    for (int r = 0; r < other; ++r)
      for (int j = 0; j < n2; ++j)
        worst = std::max(worst, std::abs(cd(outT[static_cast<std::size_t>(j * other + r)]) - sig[r].value(static_cast<double>(j) * n / n2)));
    EXPECT_LT(worst, 2e-5) << n;
    it.destroyplans();
  }
}

TEST(Interpft, EqualSizesCopyAndTwoChangedDimensionsAreRefused) {
  interp it;
  std::vector<fcomplex> in = {{1, 2}, {3, 4}, {5, 6}, {7, 8}}, out(4);
  ASSERT_EQ(it.interpft(in, 2, 2, 2, 2, out), 0);
  EXPECT_EQ(out, in);
  std::vector<fcomplex> big(16);
  EXPECT_EQ(it.interpft(in, 2, 2, 4, 4, big), 1);
  EXPECT_EQ(it.interp_lin(std::span<const fcomplex>(in), 2, 2, 4, 4, std::span<fcomplex>(big)), 1);
  EXPECT_EQ(it.interpft(in, 2, 2, 2, 1, out), 10);  // not an enlargement
  EXPECT_EQ(it.interpft_p(in, out), 10);           // no plans
}

TEST(InterpLin, StraightLinesAndTheLastValueRepeated) {
  interp it;
  // One row 0, 3, 6, 9 enlarged to 14 samples: factor 3, the last two repeat 9.
  const std::vector<double> in = {0, 3, 6, 9};
  std::vector<double> out(14);
  ASSERT_EQ(it.interp_lin(in, 1, 4, 1, 14, out), 0);
  const std::vector<double> want = {0, 1, 2, 3, 4, 5, 6, 7, 8, 9, 9, 9, 9, 9};
  EXPECT_EQ(out, want);
  // The same along columns, in float and complex.
  std::vector<float> colIn = {0, 10, 3, 20, 6, 30, 9, 40}, colOut(28);
  ASSERT_EQ(it.interp_lin(colIn, 4, 2, 14, 2, colOut), 0);
  for (int j = 0; j < 14; ++j) {
    EXPECT_FLOAT_EQ(colOut[static_cast<std::size_t>(2 * j)], static_cast<float>(want[static_cast<std::size_t>(j)]));
    EXPECT_NEAR(colOut[static_cast<std::size_t>(2 * j + 1)], 10.0f * (1 + std::min(j, 9) / 3.0f), 1e-5);
  }
  std::vector<fcomplex> cIn = {{0, 0}, {2, -4}}, cOut(4);
  ASSERT_EQ(it.interp_lin(std::span<const fcomplex>(cIn), 1, 2, 1, 4, std::span<fcomplex>(cOut)), 0);
  EXPECT_EQ(cOut[1], fcomplex(1, -2));
  EXPECT_EQ(cOut[3], fcomplex(2, -4));
}

// RMS error of the best N-tap interpolator at offset d for a flat band of width B, relative
// to the signal: r(0) - 2 w.p + w.T.w with the band's autocorrelation r(t) = sinc(B t).
double promised_error(int N, double B, double d) {
  auto sinc = [](double x) { return x == 0.0 ? 1.0 : std::sin(kPi * x) / (kPi * x); };
  const int n = (N - 1) / 2;
  Eigen::MatrixXd T(N, N);
  Eigen::VectorXd p(N);
  for (int i = 0; i < N; ++i) {
    p(i) = sinc(B * (i - n - d));
    for (int j = 0; j < N; ++j) T(i, j) = sinc(B * (i - j));
  }
  const Eigen::VectorXd w = T.ldlt().solve(p);
  return std::sqrt(std::max(0.0, 1.0 - 2.0 * w.dot(p) + w.dot(T * w)));
}

// A 2-D sequence of tones inside |fx|, |fy| < B/2 around (cx, cy).
struct Band2D {
  std::vector<double> fx, fy;
  std::vector<cd> c;
  Band2D(double B, double cx, double cy, unsigned seed) {
    std::mt19937 gen(seed);
    std::uniform_real_distribution<double> u(-0.5, 0.5), ph(0.0, 2 * kPi);
    for (int k = 0; k < 40; ++k) {
      fx.push_back(cx + B * u(gen));
      fy.push_back(cy + B * u(gen));
      c.push_back(std::polar(1.0, ph(gen)));
    }
  }
  cd value(double x, double y) const {
    cd s = 0;
    for (std::size_t k = 0; k < c.size(); ++k) s += c[k] * std::polar(1.0, 2 * kPi * (fx[k] * x + fy[k] * y));
    return s;
  }
};

double rms_error(interp2D& ip, const Band2D& sig, int n, int m, int mode) {
  std::vector<fcomplex> img(static_cast<std::size_t>(n * m));
  for (int y = 0; y < m; ++y)
    for (int x = 0; x < n; ++x) img[static_cast<std::size_t>(y * n + x)] = fcomplex(sig.value(x, y));
  std::mt19937 gen(9);
  std::uniform_real_distribution<double> ux(12.0, n - 13.0), uy(12.0, m - 13.0);
  std::vector<double> xs(50), ys(40);
  for (auto& v : xs) v = ux(gen);
  for (auto& v : ys) v = uy(gen);
  std::vector<fcomplex> out(50 * 40);
  EXPECT_EQ(ip.interp2(n, m, img, xs, ys, 50, 40, out, mode), 0);
  double err = 0.0, pow = 0.0;
  for (int j = 0; j < 40; ++j)
    for (int i = 0; i < 50; ++i) {
      const cd want = sig.value(xs[static_cast<std::size_t>(i)], ys[static_cast<std::size_t>(j)]);
      err += std::norm(cd(out[static_cast<std::size_t>(j * 50 + i)]) - want);
      pow += std::norm(want);
    }
  return std::sqrt(err / pow);
}

TEST(Interp2D, BandLimitedImagesToTheAccuracyOfTheKernel) {
  const double B = 0.6;
  for (const int P : {101, 4001})
    for (const int N : {9, 17}) {
      // Worst offset (half a sample) in each direction, plus the bank's offset quantisation.
      const double taps = std::sqrt(2.0) * promised_error(N, B, 0.5);
      const double quant = 2 * kPi * (B / 2) * 0.5 / (P - 1) * std::sqrt(2.0);
      const double bound = 1.5 * std::hypot(taps, quant) + 1e-5;
      interp2D ip(P, N, B);
      EXPECT_LT(rms_error(ip, Band2D(B, 0.0, 0.0, 1), 64, 48, 0), bound) << N << " " << P;
      // The same band moved off zero in both directions, with the bank moved along.
      interp2D moved(P, N, B);
      moved.setCentre(0.2, -0.15);
      EXPECT_LT(rms_error(moved, Band2D(B, 0.2, -0.15, 2), 64, 48, 0), bound) << N << " " << P;
      // Without the move the off-centre band is lost.
      EXPECT_GT(rms_error(ip, Band2D(B, 0.2, -0.15, 2), 64, 48, 0), 10 * bound) << N << " " << P;
    }
  // With a fine bank, a longer kernel promises and gives more.
  interp2D short9(4001, 9, B), long17(4001, 17, B);
  EXPECT_LT(rms_error(long17, Band2D(B, 0, 0, 3), 64, 48, 0), 0.25 * rms_error(short9, Band2D(B, 0, 0, 3), 64, 48, 0));
  // The three-tap quadratic on a narrow band.
  interp2D quad(101, 9, 0.1);
  EXPECT_LT(rms_error(quad, Band2D(0.1, 0, 0, 4), 64, 48, 1), 5e-3);
}

TEST(Interp2D, GridPointsOutsidePointsAndBadBanks) {
  const int n = 20, m = 10;
  std::vector<fcomplex> img(static_cast<std::size_t>(n * m));
  std::mt19937 gen(5);
  std::uniform_real_distribution<float> u(-1.0f, 1.0f);
  for (auto& v : img) v = {u(gen), u(gen)};
  interp2D ip(101, 9, 0.8);
  // On the grid: the centre row is the identity.
  std::vector<fcomplex> out(3 * 2);
  ASSERT_EQ(ip.interp2(n, m, img, 4.0, 3.0, 5.0, 4.0, 3, 2, out), 0);
  for (int j = 0; j < 2; ++j)
    for (int i = 0; i < 3; ++i)
      EXPECT_LT(std::abs(out[static_cast<std::size_t>(j * 3 + i)] - img[static_cast<std::size_t>((3 + 4 * j) * n + 4 + 5 * i)]), 1e-5f);
  // Outside the image: zero.
  ASSERT_EQ(ip.interp2(n, m, img, -0.6, 2.0, 25.0, 0.0, 2, 1, out), 0);
  EXPECT_EQ(out[0], fcomplex(0, 0));
  EXPECT_EQ(out[1], fcomplex(0, 0));
  interp2D even(100, 9, 0.8), evenTaps(101, 8, 0.8);
  EXPECT_EQ(even.interp2(n, m, img, 1.0, 1.0, 1.0, 1.0, 1, 1, out), 10);
  EXPECT_NE(evenTaps.interp2(n, m, img, 1.0, 1.0, 1.0, 1.0, 1, 1, out), 0);
  EXPECT_EQ(ip.interp2(n, m, img, 1.0, 1.0, 1.0, 1.0, 1, 1, out, 2), 10);
}

TEST(DemodulationPhase, RampAndItsInverse) {
  demodulationPhase d{0.01, 0.002, -0.03, 0.0005};
  const double line = 12.5, sample = -7.25;
  const double phi = -2 * kPi * ((sample * 0.0005 - 0.03) * line + (line * 0.002 + 0.01) * sample);
  EXPECT_NEAR(d.phase(line, sample), phi, 1e-12);
  fcomplex v(0.6f, -0.8f);
  ASSERT_EQ(d.applyDemodPhase(line, sample, v), 0);
  EXPECT_NEAR(std::arg(cd(v)), std::arg(cd(0.6, -0.8) * std::polar(1.0, phi)), 1e-5);
  ASSERT_EQ(d.applyModPhase(line, sample, v), 0);
  EXPECT_NEAR(v.real(), 0.6f, 1e-6);
  EXPECT_NEAR(v.imag(), -0.8f, 1e-6);
}

}  // namespace
}  // namespace sar::dsp

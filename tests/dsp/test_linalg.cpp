#include <gtest/gtest.h>

#include <Eigen/Dense>
#include <cmath>
#include <random>
#include <vector>

#include "dsp/fitting.hpp"
#include "dsp/linalg.hpp"
#include "dsp/nrutil.hpp"
#include "dsp/optim.hpp"

namespace sar::dsp {
namespace {

// A quartic in abscissae of thousands of samples, as the Doppler polynomials are fitted.
const double kQuartic[] = {3.0, -2.0e-3, 5.0e-7, -1.0e-10, 2.0e-14};

double quartic(double x) {
  double y = 0, p = 1;
  for (double c : kQuartic) {
    y += c * p;
    p *= x;
  }
  return y;
}

void powers(double x, std::span<double> f) {
  double p = 1;
  for (double& v : f) {
    v = p;
    p *= x;
  }
}

struct Samples {
  std::vector<double> x, y, sig;
};

Samples noisy_quartic(double x0, double x1, int n, double sigma, unsigned seed) {
  std::mt19937 gen(seed);
  std::normal_distribution<double> noise(0.0, sigma);
  Samples s;
  for (int i = 0; i < n; ++i) {
    const double x = x0 + (x1 - x0) * i / (n - 1);
    s.x.push_back(x);
    s.y.push_back(quartic(x) + (sigma > 0 ? noise(gen) : 0.0));
    s.sig.push_back(sigma > 0 ? sigma : 1.0);
  }
  return s;
}

// Coefficients land within their stated standard errors, the standard errors match the
// scatter over repeated noise draws, and chi-square matches the degrees of freedom.
TEST(Lfit, NoisyQuarticWithinStatedErrors) {
  const int n = 400, m = 5, draws = 200;
  const double sigma = 0.5;
  const std::vector<int> mask(m, 1);
  std::vector<double> sum(m, 0.0), sum2(m, 0.0);
  RowMatrixXd covar;
  for (int d = 0; d < draws; ++d) {
    const Samples s = noisy_quartic(0.0, 4000.0, n, sigma, 100u + d);
    std::vector<double> a(m, 0.0);
    double chisq = 0;
    ASSERT_EQ(lfitdOBX(s.x, s.y, s.sig, a, mask, covar, chisq, powers), 0);
    for (int j = 0; j < m; ++j) {
      sum[j] += a[j] - kQuartic[j];
      sum2[j] += (a[j] - kQuartic[j]) * (a[j] - kQuartic[j]);
    }
    if (d == 0) {
      for (int j = 0; j < m; ++j) EXPECT_LT(std::fabs(a[j] - kQuartic[j]), 4.5 * std::sqrt(covar(j, j))) << j;
      // chi-square of n - m degrees of freedom: mean n - m, deviation sqrt(2 (n - m)).
      EXPECT_NEAR(chisq, n - m, 5 * std::sqrt(2.0 * (n - m)));
    }
  }
  for (int j = 0; j < m; ++j) {
    const double scatter = std::sqrt(sum2[j] / draws);
    // 200 draws estimate a deviation to about 5 %; 20 % leaves room and catches a wrong
    // covariance (a factor of sigma or of the column scaling).
    EXPECT_NEAR(scatter / std::sqrt(covar(j, j)), 1.0, 0.2) << "term " << j;
  }
}

// Noise-free quartic on [2000, 6000]: the normal equations' condition number is the square
// of the design's (about 1e17 here), which leaves no digit; the fits must stay at rounding.
TEST(Lfit, IllConditionedAbscissaeHoldToRounding) {
  const Samples s = noisy_quartic(2000.0, 6000.0, 300, 0.0, 1);
  const std::vector<int> mask(5, 1);
  std::vector<double> a(5, 0.0), b(5, 0.0);
  RowMatrixXd covar;
  double chisq = 0, chisq2 = 0;
  ASSERT_EQ(lfitdOBX(s.x, s.y, s.sig, a, mask, covar, chisq, powers), 0);
  ASSERT_EQ(svdfitOBX(s.x, s.y, s.sig, b, chisq2, powers), 0);
  double worstA = 0, worstB = 0, scale = 0;
  for (std::size_t i = 0; i < s.x.size(); ++i) {
    double fa = 0, fb = 0, p = 1;
    for (int j = 0; j < 5; ++j, p *= s.x[i]) {
      fa += a[j] * p;
      fb += b[j] * p;
    }
    worstA = std::max(worstA, std::fabs(fa - s.y[i]));
    worstB = std::max(worstB, std::fabs(fb - s.y[i]));
    scale = std::max(scale, std::fabs(s.y[i]));
  }
  EXPECT_LT(worstA / scale, 1e-10);
  EXPECT_LT(worstB / scale, 1e-10);
  for (int j = 0; j < 5; ++j) EXPECT_NEAR(a[j] / kQuartic[j], 1.0, 1e-4) << j;
}

TEST(Lfit, HeldTermsKeepTheirValue) {
  const Samples s = noisy_quartic(0.0, 4000.0, 200, 0.1, 7);
  std::vector<double> a = {0.0, 0.0, kQuartic[2], 0.0, 0.0};
  const std::vector<int> mask = {1, 1, 0, 1, 1};
  RowMatrixXd covar;
  double chisq = 0;
  ASSERT_EQ(lfitdOBX(s.x, s.y, s.sig, a, mask, covar, chisq, powers), 0);
  EXPECT_EQ(a[2], kQuartic[2]);
  for (int j = 0; j < 5; ++j) {
    EXPECT_EQ(covar(2, j), 0.0);
    EXPECT_EQ(covar(j, 2), 0.0);
  }
  for (int j : {0, 1, 3, 4}) EXPECT_LT(std::fabs(a[j] - kQuartic[j]), 5 * std::sqrt(covar(j, j))) << j;
}

TEST(Lfit, RejectedAndSingularInputs) {
  Samples s = noisy_quartic(0.0, 10.0, 20, 0.1, 3);
  std::vector<double> a(3, 0.0);
  RowMatrixXd covar;
  double chisq = 0;
  auto quad = [](double x, std::span<double> f) { powers(x, f); };
  const std::vector<int> none(3, 0), all(3, 1);
  EXPECT_EQ(lfitdOBX(s.x, s.y, s.sig, a, none, covar, chisq, quad), 10);
  s.sig[4] = 0.0;
  EXPECT_EQ(lfitdOBX(s.x, s.y, s.sig, a, all, covar, chisq, quad), 10);
  EXPECT_EQ(svdfitOBX(s.x, s.y, s.sig, a, chisq, quad), 10);
  s.sig[4] = 0.1;
  // Two points cannot fix three terms; a basis with a repeated column is rank-deficient.
  EXPECT_EQ(lfitdOBX(std::span(s.x).first(2), s.y, s.sig, a, all, covar, chisq, quad), 1);
  auto twice = [](double x, std::span<double> f) { f[0] = 1; f[1] = x; f[2] = 2 * x; };
  EXPECT_EQ(lfitdOBX(s.x, s.y, s.sig, a, all, covar, chisq, twice), 1);
  std::vector<double> shortY(5);
  EXPECT_THROW(lfitdOBX(s.x, shortY, s.sig, a, all, covar, chisq, quad), std::invalid_argument);
}

// The indexed basis sees the point's index: a plane in (x, y[i]) from a side table.
TEST(Lfit, IndexedBasisFitsAPlane) {
  std::vector<double> x, row, z, sig;
  for (int i = 0; i < 50; ++i) {
    x.push_back(i % 10);
    row.push_back(i / 10);
    z.push_back(1.5 + 0.25 * (i % 10) - 0.75 * (i / 10));
    sig.push_back(1.0);
  }
  std::vector<double> a(3, 0.0);
  const std::vector<int> mask(3, 1);
  RowMatrixXd covar;
  double chisq = 0;
  ASSERT_EQ(lfit_modOBX(x, z, sig, a, mask, covar, chisq,
                        [&](int i, double xi, std::span<double> f) {
                          f[0] = 1;
                          f[1] = xi;
                          f[2] = row[static_cast<std::size_t>(i)];
                        }),
            0);
  EXPECT_NEAR(a[0], 1.5, 1e-12);
  EXPECT_NEAR(a[1], 0.25, 1e-12);
  EXPECT_NEAR(a[2], -0.75, 1e-12);
  EXPECT_NEAR(chisq, 0.0, 1e-20);
}

Eigen::MatrixXd random_matrix(int n, unsigned seed) {
  std::mt19937 gen(seed);
  std::uniform_real_distribution<double> u(-1, 1);
  Eigen::MatrixXd m(n, n);
  for (int i = 0; i < n; ++i)
    for (int j = 0; j < n; ++j) m(i, j) = u(gen) + (i == j ? 3.0 : 0.0);
  return m;
}

TEST(Matrix, InversesAgree) {
  const int n = 6;
  const Eigen::MatrixXd A = random_matrix(n, 5);
  std::vector<double> flat(n * n), inv1(n * n), inv2(n * n);
  for (int i = 0; i < n; ++i)
    for (int j = 0; j < n; ++j) flat[i * n + j] = A(i, j);
  ASSERT_EQ(MatInvOBX(flat, inv1, n), 0);
  ASSERT_EQ(InvMatrixOBX(flat, inv2, n), 0);
  for (const auto* inv : {&inv1, &inv2}) {
    Eigen::MatrixXd P = A * Eigen::Map<const Eigen::Matrix<double, -1, -1, Eigen::RowMajor>>(inv->data(), n, n);
    EXPECT_LT((P - Eigen::MatrixXd::Identity(n, n)).cwiseAbs().maxCoeff(), 1e-13);
  }

  NrMatrix<double> a = dmatrixOBX(1, n, 1, n), b = dmatrixOBX(1, n, 1, 1);
  for (int i = 1; i <= n; ++i) {
    for (int j = 1; j <= n; ++j) a[i][j] = A(i - 1, j - 1);
    b[i][1] = i;
  }
  ASSERT_EQ(gaussjOBX(a, n, b, 1), 0);
  Eigen::VectorXd x(n), rhs(n);
  for (int i = 0; i < n; ++i) {
    x(i) = b(i + 1, 1);
    rhs(i) = i + 1;
    for (int j = 0; j < n; ++j) EXPECT_NEAR(a(i + 1, j + 1), inv1[i * n + j], 1e-13);
  }
  EXPECT_LT((A * x - rhs).cwiseAbs().maxCoeff(), 1e-12);

  // Hilbert matrix (condition 1.5e7) in long double.
  NrMatrix<long double> h = ldmatrixOBX(1, n, 1, n), none;
  for (int i = 1; i <= n; ++i)
    for (int j = 1; j <= n; ++j) h(i, j) = 1.0L / (i + j - 1);
  ASSERT_EQ(ldgaussjOBX(h, n, none, 0), 0);
  for (int i = 1; i <= n; ++i)
    for (int j = 1; j <= n; ++j) {
      long double s = 0;
      for (int k = 1; k <= n; ++k) s += h(k, j) / (i + k - 1);
      EXPECT_NEAR(static_cast<double>(s), i == j ? 1.0 : 0.0, 1e-9) << i << "," << j;
    }
}

TEST(Matrix, SingularMatricesAreReported) {
  const std::vector<double> sing = {1, 2, 2, 4};
  std::vector<double> inv(4);
  EXPECT_EQ(MatInvOBX(sing, inv, 2), 1);
  EXPECT_EQ(InvMatrixOBX(sing, inv, 2), 1);
  NrMatrix<double> a = dmatrixOBX(1, 2, 1, 2), none;
  a(1, 1) = 1, a(1, 2) = 2, a(2, 1) = 2, a(2, 2) = 4;
  NrMatrix<double> lu = a;
  EXPECT_EQ(gaussjOBX(a, 2, none, 0), 1);
  NrVector<int> indx = ivectorOBX(1, 2);
  double d = 0;
  EXPECT_EQ(ludcmpOBX(lu, 2, indx, d), 1);
}

TEST(Matrix, LuSolvesAndGivesDeterminantSign) {
  const int n = 5;
  const Eigen::MatrixXd A = random_matrix(n, 9);
  NrMatrix<double> a = dmatrixOBX(1, n, 1, n);
  NrVector<double> b = dvectorOBX(1, n);
  NrVector<int> indx = ivectorOBX(1, n);
  for (int i = 1; i <= n; ++i) {
    for (int j = 1; j <= n; ++j) a[i][j] = A(i - 1, j - 1);
    b[i] = 2.0 * i - 3.0;
  }
  double d = 0;
  ASSERT_EQ(ludcmpOBX(a, n, indx, d), 0);
  double det = d;
  for (int i = 1; i <= n; ++i) det *= a(i, i);
  EXPECT_NEAR(det, A.determinant(), 1e-10 * std::fabs(A.determinant()));
  ASSERT_EQ(lubksbOBX(a, n, indx, b), 0);
  Eigen::VectorXd x(n), rhs(n);
  for (int i = 0; i < n; ++i) {
    x(i) = b[i + 1];
    rhs(i) = 2.0 * (i + 1) - 3.0;
  }
  EXPECT_LT((A * x - rhs).cwiseAbs().maxCoeff(), 1e-12);
}

TEST(Matrix, ColumnMajorProductTransposeAndQr) {
  // A = [1 2 3; 4 5 6] and B = [1 0; 0 1; 1 1], both stored by columns.
  const std::vector<double> A = {1, 4, 2, 5, 3, 6}, B = {1, 0, 1, 0, 1, 1};
  std::vector<double> C(4);
  ASSERT_EQ(MmoltOBX(A, B, C, 2, 3, 3, 2), 0);
  EXPECT_EQ(C, (std::vector<double>{4, 10, 5, 11}));
  ::testing::internal::CaptureStdout();
  EXPECT_EQ(MmoltOBX(A, B, C, 2, 3, 2, 2), 10);
  EXPECT_EQ(::testing::internal::GetCapturedStdout(), "\nInner matrix dimensions must agree.");

  std::vector<double> T(6);
  ASSERT_EQ(Transpose_MatrixOBX(std::vector<double>{1, 2, 3, 4, 5, 6}, T, 2, 3), 0);
  EXPECT_EQ(T, (std::vector<double>{1, 4, 2, 5, 3, 6}));

  // Overdetermined consistent system: the least-squares solution is exact.
  const std::vector<double> M = {1, 0, 0, 1, 1, 1, 1, -1};
  const std::vector<double> rhs = {2, -1, 1, 3};
  QrFactors qr;
  ASSERT_EQ(qrdcmpOBX(M, 4, 2, qr), 0);
  std::vector<double> x(2);
  ASSERT_EQ(qr_solveOBX(qr, rhs, x), 0);
  EXPECT_NEAR(x[0], 2.0, 1e-14);
  EXPECT_NEAR(x[1], -1.0, 1e-14);
  EXPECT_EQ(qrdcmpOBX(std::vector<double>{1, 2, 2, 4, 3, 6}, 3, 2, qr), 1);
}

TEST(NrContainers, ArbitraryBounds) {
  NrVector<float> v = vectorOBX(-2, 3);
  EXPECT_EQ(v.size(), 6u);
  v[-2] = 1.0f;
  v[3] = 2.0f;
  EXPECT_EQ(v.values().front(), 1.0f);
  EXPECT_EQ(v.values().back(), 2.0f);
  NrMatrix<int> m = imatrixOBX(0, 1, 5, 7);
  m[1][7] = 9;
  EXPECT_EQ(m(1, 7), 9);
  EXPECT_TRUE(m.covers(0, 1, 5, 7));
  EXPECT_FALSE(m.covers(1, 2, 5, 7));
  free_vectorOBX(v);
  EXPECT_EQ(v.size(), 0u);
}

TEST(Optim, BrentAndBisection) {
  double xmin = 0, fmin = 0;
  ASSERT_EQ(brentOBX(0.0, 1.0, 3.0, [](double x) { return (x - 1.3) * (x - 1.3) + 0.5; }, 1e-8, xmin, fmin), 0);
  EXPECT_NEAR(xmin, 1.3, 1e-6);
  EXPECT_NEAR(fmin, 0.5, 1e-12);

  // The Doppler search shape: a smooth minimum inside [-2000, 2000] Hz, tolerance 1e-4.
  ASSERT_EQ(optim_brOBX([](double f) { return std::cosh((f - 123.4) / 500.0); }, -2000, 2000, 1e-4, xmin, fmin), 0);
  EXPECT_NEAR(xmin, 123.4, 0.1);
  // A minimum on the boundary is approached, not missed.
  ASSERT_EQ(optim_brOBX([](double f) { return f; }, -2000, 2000, 1e-4, xmin, fmin), 0);
  EXPECT_NEAR(xmin, -2000, 1.0);

  double root = 0;
  ASSERT_EQ(rtbisOBX([](double x) { return std::cos(x); }, 1.0, 2.0, 1e-10, root), 0);
  EXPECT_NEAR(root, std::acos(0.0), 1e-9);
  ASSERT_EQ(rtbisOBX([](double x) { return -std::cos(x); }, 2.0, 1.0, 1e-10, root), 0);
  EXPECT_NEAR(root, std::acos(0.0), 1e-9);
  EXPECT_EQ(rtbisOBX([](double x) { return x * x + 1; }, -1.0, 1.0, 1e-6, root), 10);
  ASSERT_EQ(rtbisOBX([](double x) { return x - 4.0; }, 4.0, 9.0, 1e-6, root), 0);
  EXPECT_EQ(root, 4.0);
}

}  // namespace
}  // namespace sar::dsp

#include <gtest/gtest.h>

#include <cmath>
#include <numbers>
#include <stdexcept>

#include "dft_reference.hpp"
#include "dsp/czt.hpp"

namespace sar::dsp {
namespace {

using testing::cd;
using testing::random_samples;
using testing::relative_error;

struct CztCase {
  const char* name;
  int N, M;
  double a, b;
};

// Rows of N float samples through the kit against the direct double sum
// out[k] = sum_n x[n] exp(j n (a k - b)).
class CztAgainstDirectSum : public ::testing::TestWithParam<CztCase> {};

TEST_P(CztAgainstDirectSum, EveryRow) {
  const CztCase c = GetParam();
  const int rows = 3;
  const cvector x = random_samples(static_cast<std::size_t>(rows * c.N), 17u + c.N);
  cvector out(static_cast<std::size_t>(rows * c.M), fcomplex{9, 9});
  ASSERT_EQ(czt_c(x, c.N, out, c.M, c.a, c.b, rows), 0);
  for (int r = 0; r < rows; ++r) {
    std::vector<cd> ref(c.M), got(c.M);
    for (int k = 0; k < c.M; ++k) {
      cd s = 0;
      for (int n = 0; n < c.N; ++n) s += cd(x[r * c.N + n]) * std::polar(1.0, n * (c.a * k - c.b));
      ref[k] = s;
      got[k] = cd(out[r * c.M + k]);
    }
    // Float chirps of phase up to a L^2 / 2 lose a few 1e-6 of relative accuracy; a wrong
    // chirp sign, offset or wrap gives an error of order 1.
    EXPECT_LT(relative_error(got, ref), 2e-5) << c.name << " row " << r;
  }
}

constexpr double kPi = std::numbers::pi;

INSTANTIATE_TEST_SUITE_P(
    Shapes, CztAgainstDirectSum,
    ::testing::Values(CztCase{"DftEquivalent", 16, 16, 2 * kPi / 16, 0.0},
                      CztCase{"MoreOutputsThanInputs", 13, 64, 2 * kPi / 64, 0.3},
                      CztCase{"FewerOutputsThanInputs", 50, 17, -2 * kPi / 50, -1.0},
                      // A zoom of 0.002 cycles per sample around 0.1 cycles per sample.
                      CztCase{"ZoomedArc", 128, 40, -2 * kPi * 0.002, 2 * kPi * 0.1},
                      CztCase{"SingleSample", 1, 5, 0.7, 0.2}),
    [](const auto& info) { return std::string(info.param.name); });

// A tone between bins: the zoomed spectrum peaks at the tone, which a plain DFT cannot show.
TEST(Czt, ZoomFindsToneBetweenBins) {
  const int N = 256, M = 201;
  const double f0 = 0.1234567;  // cycles per sample
  cvector x(N);
  for (int n = 0; n < N; ++n) x[n] = fcomplex(std::polar(1.0, 2 * kPi * f0 * n));
  const double start = 0.12, step = 0.00005;
  cvector out(M);
  ASSERT_EQ(czt_c(x, N, out, M, -2 * kPi * step, 2 * kPi * start, 1), 0);
  int best = 0;
  for (int k = 1; k < M; ++k)
    if (std::abs(out[k]) > std::abs(out[best])) best = k;
  EXPECT_NEAR(start + best * step, f0, step);
  EXPECT_NEAR(std::abs(out[best]) / N, 1.0, 1e-3);
}

TEST(Czt, PlanReuseAndBadShapes) {
  czt_plan plan;
  ASSERT_EQ(czt_makep_c(plan, 10, 7), 0);
  EXPECT_EQ(plan.L, genpow(16, 1));
  const cvector x = random_samples(20, 4);
  cvector once(14), again(14);
  pczt_c(plan, x, once, 0.1, 0.2, 2);
  pczt_c(plan, x, again, 0.1, 0.2, 2);
  for (int i = 0; i < 14; ++i) EXPECT_EQ(once[i], again[i]);
  EXPECT_THROW(pczt_c(plan, x, once, 0.1, 0.2, 3), std::length_error);
  czt_destp_c(plan);
  EXPECT_EQ(pczt_c(plan, x, once, 0.1, 0.2, 1), 10);
  EXPECT_EQ(czt_makep_c(plan, 0, 7), 10);
  EXPECT_EQ(czt_c(x, 4, once, 0, 0.1, 0.2, 1), 10);
}

}  // namespace
}  // namespace sar::dsp

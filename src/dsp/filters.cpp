#include "dsp/filters.hpp"

#include <algorithm>
#include <cmath>
#include <cstdint>
#include <cstdio>
#include <numbers>
#include <stdexcept>
#include <vector>

#include "base/diagnostics.hpp"
#include "dsp/linalg.hpp"
#include "base/constants.hpp"

namespace sar::dsp {
namespace {

using base::kPi;

void require(const char* what, std::size_t have, std::int64_t need) {
  if (static_cast<std::int64_t>(have) >= need) return;
  char msg[160];
  std::snprintf(msg, sizeof msg, "%s: filter holds %zu taps, the dimensions need %lld", what, have,
                static_cast<long long>(need));
  throw std::invalid_argument(msg);
}

int rejected(const char* text) {
  base::report(base::kReportError, text);
  return 10;
}

enum class Carrier { HalfRate, Baseband };

int make_bank(std::span<fcomplex> table, int N, int P, double B, Carrier carrier, const char* routine) {
  if (N < 1 || N % 2 == 0) return rejected("GLS filter bank: the number of taps must be odd");
  if (P < 2) return rejected("GLS filter bank: at least two positions are needed");
  if (!(B > 0.0 && B <= 1.0)) return rejected("GLS filter bank: the bandwidth must lie in (0, 1]");
  require(routine, table.size(), static_cast<std::int64_t>(N) * P);
  const int n = (N - 1) / 2;
  const double step = 1.0 / (P - 1);

  // Cross-correlation p (N x P, stored by columns for MmoltOBX). Row r interpolates at
  // +x_r: the tap at i multiplies x[p + i - n], whose distance to the wanted point is
  // i - n - x_r.
  std::vector<double> p(static_cast<std::size_t>(N) * P);
  double x = -0.5;
  for (int r = 0; r < P; ++r, x += step)
    for (int i = 0; i < N; ++i) p[static_cast<std::size_t>(i) + static_cast<std::size_t>(r) * N] = B * sinc(B * (i - x - n));

  std::vector<double> T(static_cast<std::size_t>(N) * N), Tinv(T.size());
  for (int i = 0; i < N; ++i)
    for (int j = 0; j < N; ++j) T[static_cast<std::size_t>(i) * N + j] = B * sinc(B * std::abs(i - j));
  if (int st = MatInvOBX(T, Tinv, N)) return st;
  std::vector<double> W(p.size());
  if (int st = MmoltOBX(Tinv, p, W, N, N, N, P)) return st;

  for (int r = 0; r < P; ++r) {
    const double* w = W.data() + static_cast<std::size_t>(r) * N;
    double s = 0.0;
    for (int i = 0; i < N; ++i) s += w[i];
    if (s == 0.0) return rejected("GLS filter bank: a filter has no gain at the band centre");
    const double pos = r * step - 0.5;
    for (int i = 0; i < N; ++i) {
      // Half-rate carrier exp(-j pi t) between tap and output position; at baseband only the
      // phase of the output position.
      const double a = carrier == Carrier::HalfRate ? -kPi * (n - i + pos) : -kPi * pos;
      table[static_cast<std::size_t>(r) * N + i] =
          fcomplex(static_cast<float>(w[i] / s * std::cos(a)), static_cast<float>(w[i] / s * std::sin(a)));
    }
  }
  return 0;
}

}  // namespace

double sinc(double u) {
  if (u == 0.0) return 1.0;
  const double v = kPi * u;
  return std::sin(v) / v;
}

int MakeGLS(std::span<fcomplex> table, int N, int P, double B) {
  return make_bank(table, N, P, B, Carrier::HalfRate, "MakeGLS");
}

int MakeGLSlowpass(std::span<fcomplex> table, int N, int P, double B) {
  return make_bank(table, N, P, B, Carrier::Baseband, "MakeGLSlowpass");
}

int glsF(std::span<float> filter, int N, double shift, double B, double gap) {
  if (N < 1) return rejected("glsF: no taps");
  if (!(B > 0.0 && B <= 1.0)) return rejected("glsF: the bandwidth must lie in (0, 1]");
  require("glsF", filter.size(), N);
  const double B2 = 1.0 - (B + gap);
  const int n = (N - 1) / 2;
  auto alt = [](int i) { return i % 2 == 0 ? 1.0 : -1.0; };
  std::vector<double> q(static_cast<std::size_t>(N)), T(static_cast<std::size_t>(N) * N), Tinv(T.size());
  for (int i = 0; i < N; ++i) {
    const double d = i - shift - n;
    q[static_cast<std::size_t>(i)] = B * (sinc(B * d) + 1e-5 * alt(i) * sinc(B2 * d));
  }
  for (int i = 0; i < N; ++i)
    for (int j = 0; j < N; ++j) {
      const int k = std::abs(i - j);
      T[static_cast<std::size_t>(i) * N + j] = B * (sinc(B * k) + alt(k) * sinc(B2 * k));
    }
  if (int st = MatInvOBX(T, Tinv, N)) return st;
  std::vector<double> w(static_cast<std::size_t>(N));
  if (int st = MmoltOBX(Tinv, q, w, N, N, N, 1)) return st;
  double s = 0.0;
  for (double v : w) s += v;
  if (s == 0.0) return rejected("glsF: the filter has no DC gain");
  for (int i = 0; i < N; ++i) filter[static_cast<std::size_t>(i)] = static_cast<float>(w[static_cast<std::size_t>(i)] / s);
  return 0;
}

int glsFcomplex(std::span<fcomplex> filter, int N, double shift, double B, double gap) {
  require("glsFcomplex", filter.size(), N);
  std::vector<float> real(static_cast<std::size_t>(std::max(N, 0)));
  if (int st = glsF(real, N, shift, B, gap)) return st;
  for (int i = 0; i < N; ++i) filter[static_cast<std::size_t>(i)] = fcomplex(real[static_cast<std::size_t>(i)], 0.0f);
  return 0;
}

}  // namespace sar::dsp

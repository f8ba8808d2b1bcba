#include "dsp/czt.hpp"

#include <algorithm>
#include <cmath>
#include <cstdint>
#include <cstdio>
#include <stdexcept>
#include <vector>

namespace sar::dsp {
namespace {

fcomplex mul(fcomplex u, fcomplex v) {
  const dcomplex p = dcomplex(u.real(), u.imag()) * dcomplex(v.real(), v.imag());
  return {static_cast<float>(p.real()), static_cast<float>(p.imag())};
}

fcomplex phasor(double phase) { return {static_cast<float>(std::cos(phase)), static_cast<float>(std::sin(phase))}; }

void check_size(const char* which, std::size_t have, std::int64_t need) {
  if (static_cast<std::int64_t>(have) >= need) return;
  char msg[160];
  std::snprintf(msg, sizeof msg, "pczt_c: %s holds %zu samples, the rows need %lld", which, have,
                static_cast<long long>(need));
  throw std::length_error(msg);
}

}  // namespace

int czt_makep_c(czt_plan& plan, int N, int M) {
  plan = czt_plan{};
  if (N < 1 || M < 1) return 10;
  const int L = genpow(N + M - 1, 1);
  if (L < 1) return 10;
  // The inner plan results are not looked at: a refused engine plan leaves the stage empty.
  fft_makep_c(plan.forward, L, L, 1, 1, 1, 0, 1);
  fft_makep_c(plan.backward, L, L, 1, 1, -1, 0, 1);
  plan.N = N;
  plan.M = M;
  plan.L = L;
  return 0;
}

int pczt_c(const czt_plan& plan, std::span<const fcomplex> input, std::span<fcomplex> output, double a, double b,
           int rows) {
  const int N = plan.N, M = plan.M, L = plan.L;
  if (N < 1 || M < 1 || L < 1 || rows < 0) return 10;
  check_size("input", input.size(), static_cast<std::int64_t>(rows) * N);
  check_size("output", output.size(), static_cast<std::int64_t>(rows) * M);

  // q[i] = i^2 a / 2 for i = 1-N .. P, stored at i + N - 1.
  const int P = std::max(N - 1, M - 1);
  const int span = N + P;
  std::vector<double> q(static_cast<std::size_t>(span));
  for (int s = 0; s < span; ++s) {
    const double i = s - (N - 1);
    q[static_cast<std::size_t>(s)] = i * i * a * 0.5;
  }
  auto qi = [&](int i) { return q[static_cast<std::size_t>(i + N - 1)]; };

  cvector c(static_cast<std::size_t>(span));
  for (int s = 0; s < span; ++s) c[static_cast<std::size_t>(s)] = phasor(q[static_cast<std::size_t>(s)]);
  cvector d(static_cast<std::size_t>(N));
  for (int n = 0; n < N; ++n) d[static_cast<std::size_t>(n)] = phasor(qi(n) - n * b);

  cvector h(static_cast<std::size_t>(L), fcomplex{});
  for (int i = 0; i <= N + M - 2; ++i) h[static_cast<std::size_t>(i)] = phasor(-qi(i - (N - 1)));
  pfft_c(plan.forward, h);

  cvector y(static_cast<std::size_t>(L));
  for (int r = 0; r < rows; ++r) {
    const fcomplex* x = input.data() + static_cast<std::ptrdiff_t>(r) * N;
    fcomplex* out = output.data() + static_cast<std::ptrdiff_t>(r) * M;
    std::fill(y.begin(), y.end(), fcomplex{});
    for (int n = 0; n < N; ++n) y[static_cast<std::size_t>(n)] = mul(x[n], d[static_cast<std::size_t>(n)]);
    pfft_c(plan.forward, y);
    for (int k = 0; k < L; ++k) y[static_cast<std::size_t>(k)] = mul(y[static_cast<std::size_t>(k)], h[static_cast<std::size_t>(k)]);
    pfft_c(plan.backward, y);
    for (int k = 0; k < M; ++k)
      out[k] = mul(y[static_cast<std::size_t>(k + N - 1)], c[static_cast<std::size_t>(k + N - 1)]);
  }
  return 0;
}

int czt_destp_c(czt_plan& plan) {
  plan = czt_plan{};
  return 0;
}

int czt_c(std::span<const fcomplex> input, int N, std::span<fcomplex> output, int M, double a, double b, int rows) {
  czt_plan plan;
  if (int st = czt_makep_c(plan, N, M)) return st;
  return pczt_c(plan, input, output, a, b, rows);
}

}  // namespace sar::dsp

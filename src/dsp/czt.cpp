#include "dsp/czt.hpp"

#include <algorithm>
#include <bit>
#include <cmath>
#include <cstdint>
#include <cstdio>
#include <mutex>
#include <stdexcept>
#include <vector>

#include "dsp/vsincos.hpp"

#if defined(__SSE2__)
#include <emmintrin.h>
#endif
#if defined(__GNUC__) && defined(__x86_64__)
#include <immintrin.h>
#endif

namespace sar::dsp {
namespace detail {

/// The tables of one step a: the quadratic phase q[i] = i^2 a / 2 for i = 1-N .. max(N, M) - 1
/// (stored at i + N - 1), the input chirp's quadratic part exp(j q[n]) for n = 0..N-1 in double,
/// the output chirp exp(j q[k]) for k = 0..M-1 and the forward transform of the kernel
/// exp(-j q[i]) for i = 1-N .. M-1, zero padded to L.
struct CztKernel {
  std::uint64_t aBits = 0;
  std::vector<double> q;
  std::vector<dcomplex> inQuadratic;
  cvector outChirp;
  cvector kernel;
};

class CztTables {
 public:
  std::shared_ptr<const CztKernel> kernel(const czt_plan& plan, double a);

 private:
  // A plan seldom sees more than one step; a few are kept so that alternating steps do not
  // rebuild the kernel on every call.
  static constexpr std::size_t kKernels = 4;
  std::mutex mutex_;
  std::vector<std::shared_ptr<const CztKernel>> kernels_;  // most recently made first
};

/// The input chirp exp(j (q[n] - n b)), n = 0..N-1, of one step and start, into d. The start
/// changes with every Doppler line of the Stolt kernel, so its linear phase is not taken through
/// the sine and cosine sample by sample: exp(-j n b) = exp(-j 64 h b) exp(-j l b) for
/// n = 64 h + l, which asks for N / 64 + 64 phasors instead of N; the products are in double.
void input_chirp(const CztKernel& k, int N, double b, fcomplex* d);

}  // namespace detail

namespace {

fcomplex mul(fcomplex u, fcomplex v) {
  const dcomplex p = dcomplex(u.real(), u.imag()) * dcomplex(v.real(), v.imag());
  return {static_cast<float>(p.real()), static_cast<float>(p.imag())};
}

fcomplex phasor(double phase) { return {static_cast<float>(std::cos(phase)), static_cast<float>(std::sin(phase))}; }

// out[k] = mul(u[k], v[k]) for k < n; out may be u or v. The products of float operands are
// exact in double, so the plain formula (ar br - ai bi, ai br + ar bi) gives mul's result
// whenever it is not NaN in both parts; only then (infinite operands) is the library's
// recovery asked for. The vector versions do the same operations lane by lane; none of them
// is compiled with fused multiply-add, so all give the same bits.
void multiply_base(const fcomplex* u, const fcomplex* v, fcomplex* out, int n) {
#if defined(__SSE2__)
  const __m128d flipReal = _mm_set_pd(0.0, -0.0);
  for (int k = 0; k < n; ++k) {
    const __m128d a = _mm_cvtps_pd(_mm_castpd_ps(_mm_load_sd(reinterpret_cast<const double*>(u + k))));
    const __m128d b = _mm_cvtps_pd(_mm_castpd_ps(_mm_load_sd(reinterpret_cast<const double*>(v + k))));
    // (ar br, ai br) + (-ai bi, ar bi)
    const __m128d p1 = _mm_mul_pd(a, _mm_unpacklo_pd(b, b));
    const __m128d p2 = _mm_xor_pd(_mm_mul_pd(_mm_shuffle_pd(a, a, 1), _mm_unpackhi_pd(b, b)), flipReal);
    const __m128d r = _mm_add_pd(p1, p2);
    if (_mm_movemask_pd(_mm_cmpunord_pd(r, r)) == 3) [[unlikely]] {
      out[k] = mul(u[k], v[k]);
    } else {
      _mm_store_sd(reinterpret_cast<double*>(out + k), _mm_castps_pd(_mm_cvtpd_ps(r)));
    }
  }
#else
  for (int k = 0; k < n; ++k) {
    const double ar = u[k].real(), ai = u[k].imag(), br = v[k].real(), bi = v[k].imag();
    const double re = ar * br - ai * bi, im = ar * bi + ai * br;
    out[k] = (std::isnan(re) && std::isnan(im)) ? mul(u[k], v[k]) : fcomplex(static_cast<float>(re), static_cast<float>(im));
  }
#endif
}

#if defined(__GNUC__) && defined(__x86_64__)
#define SAR_CZT_AVX 1
/// Two samples a step in 256-bit registers (AVX without FMA).
[[gnu::target("avx")]] void multiply_avx(const fcomplex* u, const fcomplex* v, fcomplex* out, int n) {
  const __m256d flipReal = _mm256_set_pd(0.0, -0.0, 0.0, -0.0);
  int k = 0;
  for (; k + 2 <= n; k += 2) {
    const __m256d a = _mm256_cvtps_pd(_mm_loadu_ps(reinterpret_cast<const float*>(u + k)));
    const __m256d b = _mm256_cvtps_pd(_mm_loadu_ps(reinterpret_cast<const float*>(v + k)));
    const __m256d p1 = _mm256_mul_pd(a, _mm256_movedup_pd(b));
    const __m256d p2 = _mm256_xor_pd(_mm256_mul_pd(_mm256_permute_pd(a, 0x5), _mm256_permute_pd(b, 0xf)), flipReal);
    const __m256d r = _mm256_add_pd(p1, p2);
    const int nan = _mm256_movemask_pd(_mm256_cmp_pd(r, r, _CMP_UNORD_Q));
    if ((nan & (nan >> 1) & 0x5) != 0) [[unlikely]] {
      const fcomplex x = mul(u[k], v[k]), y = mul(u[k + 1], v[k + 1]);
      out[k] = x;
      out[k + 1] = y;
      continue;
    }
    _mm_storeu_ps(reinterpret_cast<float*>(out + k), _mm256_cvtpd_ps(r));
  }
  if (k < n) multiply_base(u + k, v + k, out + k, n - k);
}

/// Four samples a step in 512-bit registers. The products and the sum use the explicitly
/// rounded forms, which are never fused into a multiply-add; the masked forms (all lanes set)
/// stand for the plain ones, whose undefined pass-through operand makes this compiler warn.
[[gnu::target("avx512f")]] void multiply_avx512(const fcomplex* u, const fcomplex* v, fcomplex* out, int n) {
  constexpr int kRound = _MM_FROUND_TO_NEAREST_INT | _MM_FROUND_NO_EXC;
  constexpr __mmask8 all = 0xff;
  const __m512i flipReal = _mm512_set_epi64(0, INT64_MIN, 0, INT64_MIN, 0, INT64_MIN, 0, INT64_MIN);
  int k = 0;
  for (; k + 4 <= n; k += 4) {
    const __m512d a = _mm512_maskz_cvtps_pd(all, _mm256_loadu_ps(reinterpret_cast<const float*>(u + k)));
    const __m512d b = _mm512_maskz_cvtps_pd(all, _mm256_loadu_ps(reinterpret_cast<const float*>(v + k)));
    const __m512d p1 = _mm512_maskz_mul_round_pd(all, a, _mm512_maskz_movedup_pd(all, b), kRound);
    const __m512d p2 = _mm512_maskz_mul_round_pd(all, _mm512_maskz_permute_pd(all, a, 0x55), _mm512_maskz_permute_pd(all, b, 0xff), kRound);
    const __m512d r = _mm512_maskz_add_round_pd(all, p1, _mm512_castsi512_pd(_mm512_xor_si512(_mm512_castpd_si512(p2), flipReal)), kRound);
    const unsigned nan = _mm512_cmp_pd_mask(r, r, _CMP_UNORD_Q);
    if ((nan & (nan >> 1) & 0x55u) != 0) [[unlikely]] {
      for (int i = 0; i < 4; ++i) out[k + i] = mul(u[k + i], v[k + i]);
      continue;
    }
    _mm256_storeu_ps(reinterpret_cast<float*>(out + k), _mm512_maskz_cvtpd_ps(all, r));
  }
  if (k < n) multiply_avx(u + k, v + k, out + k, n - k);
}
#endif

using Multiply = void (*)(const fcomplex*, const fcomplex*, fcomplex*, int);

Multiply pick_multiply() {
#ifdef SAR_CZT_AVX
  __builtin_cpu_init();
  if (__builtin_cpu_supports("avx512f")) return multiply_avx512;
  if (__builtin_cpu_supports("avx")) return multiply_avx;
#endif
  return multiply_base;
}

void multiply(const fcomplex* u, const fcomplex* v, fcomplex* out, int n) {
  static const Multiply run = pick_multiply();
  run(u, v, out, n);
}

void check_size(const char* which, std::size_t have, std::int64_t need) {
  if (static_cast<std::int64_t>(have) >= need) return;
  char msg[160];
  std::snprintf(msg, sizeof msg, "pczt_c: %s holds %zu samples, the rows need %lld", which, have,
                static_cast<long long>(need));
  throw std::length_error(msg);
}

/// Working row of one thread, reused from call to call (the transform length of the Stolt
/// grid is too large for the allocator to keep it cheap).
cvector& scratch(std::size_t n) {
  thread_local cvector y;
  if (y.size() < n) {
    cvector().swap(y);
    y.resize(n);
  }
  return y;
}

}  // namespace

namespace detail {

std::shared_ptr<const CztKernel> CztTables::kernel(const czt_plan& plan, double a) {
  const std::uint64_t bits = std::bit_cast<std::uint64_t>(a);
  {
    std::lock_guard lock(mutex_);
    for (const auto& k : kernels_)
      if (k->aBits == bits) return k;
  }
  const int N = plan.N, M = plan.M, L = plan.L;
  auto k = std::make_shared<CztKernel>();
  k->aBits = bits;
  const int P = std::max(N - 1, M - 1);
  const int span = N + P;
  k->q.resize(static_cast<std::size_t>(span));
  for (int s = 0; s < span; ++s) {
    const double i = s - (N - 1);
    k->q[static_cast<std::size_t>(s)] = i * i * a * 0.5;
  }
  k->inQuadratic.resize(static_cast<std::size_t>(N));
  for (int n = 0; n < N; ++n) {
    const double qn = k->q[static_cast<std::size_t>(n + N - 1)];
    k->inQuadratic[static_cast<std::size_t>(n)] = dcomplex(std::cos(qn), std::sin(qn));
  }
  k->outChirp.resize(static_cast<std::size_t>(M));
  for (int m = 0; m < M; ++m) k->outChirp[static_cast<std::size_t>(m)] = phasor(k->q[static_cast<std::size_t>(m + N - 1)]);
  k->kernel.assign(static_cast<std::size_t>(L), fcomplex{});
  for (int i = 0; i <= N + M - 2; ++i) k->kernel[static_cast<std::size_t>(i)] = phasor(-k->q[static_cast<std::size_t>(i)]);
  pfft_c(plan.forward, k->kernel);

  std::lock_guard lock(mutex_);
  // Another thread may have made the same tables meanwhile: keep the first, they are equal.
  for (const auto& old : kernels_)
    if (old->aBits == bits) return old;
  kernels_.insert(kernels_.begin(), k);
  if (kernels_.size() > kKernels) kernels_.pop_back();
  return k;
}

void input_chirp(const CztKernel& k, int N, double b, fcomplex* d) {
  constexpr int kRun = 64;
  const int runs = (N + kRun - 1) / kRun;
  thread_local std::vector<double> phase, sn, cs;
  const auto need = static_cast<std::size_t>(kRun + runs);
  if (phase.size() < need) {
    phase.resize(need);
    sn.resize(need);
    cs.resize(need);
  }
  for (int l = 0; l < kRun; ++l) phase[static_cast<std::size_t>(l)] = -l * b;
  for (int h = 0; h < runs; ++h) phase[static_cast<std::size_t>(kRun + h)] = -(static_cast<double>(h) * kRun) * b;
  sincos_n(std::span<const double>(phase.data(), need), sn, cs);
  // The products written out: std::complex's operator* would check every one for NaN.
  for (int h = 0; h < runs; ++h) {
    const double oc = cs[static_cast<std::size_t>(kRun + h)], os = sn[static_cast<std::size_t>(kRun + h)];
    const int first = h * kRun, last = std::min(N, first + kRun);
    const dcomplex* q = k.inQuadratic.data() + first;
    for (int l = 0; l < last - first; ++l) {
      const double lc = cs[static_cast<std::size_t>(l)] * oc - sn[static_cast<std::size_t>(l)] * os;
      const double ls = cs[static_cast<std::size_t>(l)] * os + sn[static_cast<std::size_t>(l)] * oc;
      const double qr = q[l].real(), qi = q[l].imag();
      d[first + l] = fcomplex(static_cast<float>(qr * lc - qi * ls), static_cast<float>(qr * ls + qi * lc));
    }
  }
}

}  // namespace detail

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
  plan.tables = std::make_shared<detail::CztTables>();
  return 0;
}

int pczt_c(const czt_plan& plan, std::span<const fcomplex> input, std::span<fcomplex> output, double a, double b,
           int rows) {
  const int N = plan.N, M = plan.M, L = plan.L;
  if (N < 1 || M < 1 || L < 1 || rows < 0 || !plan.tables) return 10;
  check_size("input", input.size(), static_cast<std::int64_t>(rows) * N);
  check_size("output", output.size(), static_cast<std::int64_t>(rows) * M);
  if (rows == 0) return 0;

  const auto kernel = plan.tables->kernel(plan, a);
  thread_local cvector chirp;
  if (chirp.size() < static_cast<std::size_t>(N)) chirp.resize(static_cast<std::size_t>(N));
  detail::input_chirp(*kernel, N, b, chirp.data());
  const fcomplex* d = chirp.data();
  const fcomplex* h = kernel->kernel.data();
  const fcomplex* c = kernel->outChirp.data();

  cvector& y = scratch(static_cast<std::size_t>(L));
  const std::span<fcomplex> row(y.data(), static_cast<std::size_t>(L));
  for (int r = 0; r < rows; ++r) {
    const fcomplex* x = input.data() + static_cast<std::ptrdiff_t>(r) * N;
    fcomplex* out = output.data() + static_cast<std::ptrdiff_t>(r) * M;
    multiply(x, d, y.data(), N);
    std::fill(y.begin() + N, y.begin() + L, fcomplex{});
    pfft_c(plan.forward, row);
    multiply(y.data(), h, y.data(), L);
    pfft_c(plan.backward, row);
    multiply(y.data() + (N - 1), c, out, M);
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

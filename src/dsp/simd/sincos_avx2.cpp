// Compiled with AVX2 and FMA enabled (see the folder's CMake rule); only called after the
// processor has been found to have both.
#include <immintrin.h>

#include <algorithm>
#include <sleef.h>

#include "dsp/vsincos.hpp"

namespace sar::dsp::detail {

void sincos_avx2(const double* phase, double* s, double* c, std::size_t n) {
  std::size_t i = 0;
  for (; i + 4 <= n; i += 4) {
    const Sleef___m256d_2 r = Sleef_sincosd4_u35avx2(_mm256_loadu_pd(phase + i));
    _mm256_storeu_pd(s + i, r.x);
    _mm256_storeu_pd(c + i, r.y);
  }
  if (i < n) {
    // The tail through the same function, padded, so a phase's result does not depend on
    // where it stands in the array.
    alignas(32) double p[4] = {0.0, 0.0, 0.0, 0.0}, rs[4], rc[4];
    for (std::size_t k = 0; i + k < n; ++k) p[k] = phase[i + k];
    const Sleef___m256d_2 r = Sleef_sincosd4_u35avx2(_mm256_load_pd(p));
    _mm256_store_pd(rs, r.x);
    _mm256_store_pd(rc, r.y);
    for (std::size_t k = 0; i + k < n; ++k) {
      s[i + k] = rs[k];
      c[i + k] = rc[k];
    }
  }
}

void rotate_avx2(fcomplex* x, const double* phase, const double* weight, std::size_t n) {
  constexpr std::size_t kSlice = 256;
  alignas(32) double s[kSlice], c[kSlice];
  for (std::size_t o = 0; o < n; o += kSlice) {
    const std::size_t m = std::min(kSlice, n - o);
    sincos_avx2(phase + o, s, c, m);
    if (weight) {
      for (std::size_t i = 0; i < m; ++i) {
        c[i] *= weight[o + i];
        s[i] *= weight[o + i];
      }
    }
    float* v = reinterpret_cast<float*>(x + o);
    std::size_t i = 0;
    // Four samples a step: (re c - im s, im c + re s) in double as the scalar form computes it
    // (no fused multiply-add: the sum of the rounded products), then rounded to float.
    for (; i + 4 <= m; i += 4) {
      const __m256 xf = _mm256_loadu_ps(v + 2 * i);
      const __m256d lo = _mm256_cvtps_pd(_mm256_castps256_ps128(xf));
      const __m256d hi = _mm256_cvtps_pd(_mm256_extractf128_ps(xf, 1));
      const __m256d cc = _mm256_load_pd(c + i), ss = _mm256_load_pd(s + i);
      const __m256d cLo = _mm256_permute4x64_pd(cc, 0x50), cHi = _mm256_permute4x64_pd(cc, 0xfa);
      const __m256d sLo = _mm256_permute4x64_pd(ss, 0x50), sHi = _mm256_permute4x64_pd(ss, 0xfa);
      const __m256d rLo = _mm256_addsub_pd(_mm256_mul_pd(lo, cLo), _mm256_mul_pd(_mm256_permute_pd(lo, 0x5), sLo));
      const __m256d rHi = _mm256_addsub_pd(_mm256_mul_pd(hi, cHi), _mm256_mul_pd(_mm256_permute_pd(hi, 0x5), sHi));
      _mm256_storeu_ps(v + 2 * i, _mm256_set_m128(_mm256_cvtpd_ps(rHi), _mm256_cvtpd_ps(rLo)));
    }
    for (; i < m; ++i) {
      const double re = v[2 * i], im = v[2 * i + 1];
      v[2 * i] = static_cast<float>(re * c[i] - im * s[i]);
      v[2 * i + 1] = static_cast<float>(re * s[i] + im * c[i]);
    }
  }
}

}  // namespace sar::dsp::detail

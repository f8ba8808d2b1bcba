// Compiled with AVX2 and FMA enabled (see the folder's CMake rule); only called after the
// processor has been found to have both.
#include <immintrin.h>

#include <algorithm>
#include <cmath>

#include "stripmap/stolt_lines.hpp"

namespace sar::stripmap::detail::avx2 {
#include "stripmap/stolt_lines.inc"

namespace {

// Four output bins a step; the two neighbours of each are gathered as one 64-bit pair of
// floats.
void two_point(const fcomplex* z, int bins, const double* x, const double* s, const double* c, int count,
               fcomplex* out) {
  const __m256d zero = _mm256_setzero_pd(), one = _mm256_set1_pd(1.0), top = _mm256_set1_pd(bins);
  const __m256d all = _mm256_castsi256_pd(_mm256_set1_epi64x(-1));
  const auto* pairs = reinterpret_cast<const double*>(z);
  int u = 0;
  for (; u + 4 <= count; u += 4) {
    const __m256d xv = _mm256_loadu_pd(x + u);
    const __m256d f = _mm256_floor_pd(xv);
    const __m256d in = _mm256_and_pd(_mm256_cmp_pd(f, zero, _CMP_GE_OQ), _mm256_cmp_pd(f, top, _CMP_LT_OQ));
    const __m128i p = _mm256_cvttpd_epi32(_mm256_and_pd(f, in));
    const __m256d t = _mm256_sub_pd(xv, f);
    const __m256 a = _mm256_castpd_ps(_mm256_mask_i32gather_pd(zero, pairs, p, all, 8));
    const __m256 b = _mm256_castpd_ps(_mm256_mask_i32gather_pd(zero, pairs + 1, p, all, 8));
    const __m256d cv = _mm256_loadu_pd(c + u), sv = _mm256_loadu_pd(s + u);
    __m128 half[2];
    for (int h = 0; h < 2; ++h) {
      // Bins 2h and 2h + 1: (re, im) pairs in double, each bin's t, c, s and mask doubled.
      const __m256d ah = _mm256_cvtps_pd(h == 0 ? _mm256_castps256_ps128(a) : _mm256_extractf128_ps(a, 1));
      const __m256d bh = _mm256_cvtps_pd(h == 0 ? _mm256_castps256_ps128(b) : _mm256_extractf128_ps(b, 1));
      const __m256d th = h == 0 ? _mm256_permute4x64_pd(t, 0x50) : _mm256_permute4x64_pd(t, 0xFA);
      const __m256d ch = h == 0 ? _mm256_permute4x64_pd(cv, 0x50) : _mm256_permute4x64_pd(cv, 0xFA);
      const __m256d sh = h == 0 ? _mm256_permute4x64_pd(sv, 0x50) : _mm256_permute4x64_pd(sv, 0xFA);
      const __m256d mh = h == 0 ? _mm256_permute4x64_pd(in, 0x50) : _mm256_permute4x64_pd(in, 0xFA);
      const __m256d mix = _mm256_sub_pd(_mm256_mul_pd(_mm256_sub_pd(one, th), ah), _mm256_mul_pd(th, bh));
      const __m256d turned =
          _mm256_addsub_pd(_mm256_mul_pd(mix, ch), _mm256_mul_pd(_mm256_permute_pd(mix, 0x5), sh));
      half[h] = _mm256_cvtpd_ps(_mm256_and_pd(turned, mh));
    }
    _mm256_storeu_ps(reinterpret_cast<float*>(out + u), _mm256_set_m128(half[1], half[0]));
  }
  // The tail through the baseline loop, the same formula a bin at a time.
  if (u < count) base_isa::kernels.two_point(z, bins, x + u, s + u, c + u, count - u, out + u);
}

}  // namespace

const LineKernels kernels{reference_phase, node_weights, output_bins, two_point};
}  // namespace sar::stripmap::detail::avx2

// Compiled with AVX2 and FMA enabled (see the folder's CMake rule); only called after the
// processor has been found to have both.
#include <immintrin.h>

#include <cstdint>

#include "dsp/detail/transpose.hpp"

namespace sar::dsp::detail {

namespace {

// One complex float is 64 bits: a 4 x 4 tile of samples is a 4 x 4 transpose of doubles.
inline void turn4(__m256d& r0, __m256d& r1, __m256d& r2, __m256d& r3) {
  const __m256d a = _mm256_unpacklo_pd(r0, r1);  // r0[0] r1[0] r0[2] r1[2]
  const __m256d b = _mm256_unpackhi_pd(r0, r1);  // r0[1] r1[1] r0[3] r1[3]
  const __m256d c = _mm256_unpacklo_pd(r2, r3);
  const __m256d d = _mm256_unpackhi_pd(r2, r3);
  r0 = _mm256_permute2f128_pd(a, c, 0x20);  // column 0
  r1 = _mm256_permute2f128_pd(b, d, 0x20);  // column 1
  r2 = _mm256_permute2f128_pd(a, c, 0x31);  // column 2
  r3 = _mm256_permute2f128_pd(b, d, 0x31);  // column 3
}

}  // namespace

void gather_columns_avx2(const fcomplex* src, std::int64_t stride, int n, int count, fcomplex* t) {
  const auto* s = reinterpret_cast<const double*>(src);
  auto* d = reinterpret_cast<double*>(t);
  const int n4 = n / 4 * 4, c4 = count / 4 * 4;
  for (int l0 = 0; l0 < n4; l0 += kTurnTileRows) {
    const int l1 = l0 + kTurnTileRows < n4 ? l0 + kTurnTileRows : n4;
    for (int k = 0; k < c4; k += 4)
      for (int l = l0; l < l1; l += 4) {
        __m256d r0 = _mm256_loadu_pd(s + (l + 0) * stride + k), r1 = _mm256_loadu_pd(s + (l + 1) * stride + k);
        __m256d r2 = _mm256_loadu_pd(s + (l + 2) * stride + k), r3 = _mm256_loadu_pd(s + (l + 3) * stride + k);
        turn4(r0, r1, r2, r3);
        _mm256_storeu_pd(d + static_cast<std::int64_t>(k + 0) * n + l, r0);
        _mm256_storeu_pd(d + static_cast<std::int64_t>(k + 1) * n + l, r1);
        _mm256_storeu_pd(d + static_cast<std::int64_t>(k + 2) * n + l, r2);
        _mm256_storeu_pd(d + static_cast<std::int64_t>(k + 3) * n + l, r3);
      }
  }
  // The edges one sample at a time.
  for (int k = 0; k < count; ++k)
    for (int l = k < c4 ? n4 : 0; l < n; ++l) t[static_cast<std::int64_t>(k) * n + l] = src[l * stride + k];
}

void scatter_columns_avx2(const fcomplex* t, int n, int count, fcomplex* dst, std::int64_t stride) {
  const auto* s = reinterpret_cast<const double*>(t);
  auto* d = reinterpret_cast<double*>(dst);
  const int n4 = n / 4 * 4, c4 = count / 4 * 4;
  for (int l0 = 0; l0 < n4; l0 += kTurnTileRows) {
    const int l1 = l0 + kTurnTileRows < n4 ? l0 + kTurnTileRows : n4;
    for (int l = l0; l < l1; l += 4)
      for (int k = 0; k < c4; k += 4) {
        __m256d r0 = _mm256_loadu_pd(s + static_cast<std::int64_t>(k + 0) * n + l);
        __m256d r1 = _mm256_loadu_pd(s + static_cast<std::int64_t>(k + 1) * n + l);
        __m256d r2 = _mm256_loadu_pd(s + static_cast<std::int64_t>(k + 2) * n + l);
        __m256d r3 = _mm256_loadu_pd(s + static_cast<std::int64_t>(k + 3) * n + l);
        turn4(r0, r1, r2, r3);
        _mm256_storeu_pd(d + (l + 0) * stride + k, r0);
        _mm256_storeu_pd(d + (l + 1) * stride + k, r1);
        _mm256_storeu_pd(d + (l + 2) * stride + k, r2);
        _mm256_storeu_pd(d + (l + 3) * stride + k, r3);
      }
  }
  for (int k = 0; k < count; ++k)
    for (int l = k < c4 ? n4 : 0; l < n; ++l) dst[l * stride + k] = t[static_cast<std::int64_t>(k) * n + l];
}

}  // namespace sar::dsp::detail

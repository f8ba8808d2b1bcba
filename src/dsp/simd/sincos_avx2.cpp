// Compiled with AVX2 and FMA enabled (see the folder's CMake rule); only called after the
// processor has been found to have both.
#include <immintrin.h>
#include <sleef.h>

#include "dsp/vsincos.hpp"

namespace sar::dsp::detail {

void sincos_avx2(const double* phase, double* s, double* c, std::size_t n) {
  std::size_t i = 0;
  for (; i + 4 <= n; i += 4) {
    const Sleef___m256d_2 r = Sleef_sincosd4_u10avx2(_mm256_loadu_pd(phase + i));
    _mm256_storeu_pd(s + i, r.x);
    _mm256_storeu_pd(c + i, r.y);
  }
  if (i < n) {
    // The tail through the same function, padded, so a phase's result does not depend on
    // where it stands in the array.
    alignas(32) double p[4] = {0.0, 0.0, 0.0, 0.0}, rs[4], rc[4];
    for (std::size_t k = 0; i + k < n; ++k) p[k] = phase[i + k];
    const Sleef___m256d_2 r = Sleef_sincosd4_u10avx2(_mm256_load_pd(p));
    _mm256_store_pd(rs, r.x);
    _mm256_store_pd(rc, r.y);
    for (std::size_t k = 0; i + k < n; ++k) {
      s[i + k] = rs[k];
      c[i + k] = rc[k];
    }
  }
}

}  // namespace sar::dsp::detail

#include "stripmap/stolt_lines.hpp"

#include <algorithm>
#include <cmath>

namespace sar::stripmap::detail {

namespace base_isa {
#include "stripmap/stolt_lines.inc"

void two_point(const fcomplex* zc, int bins, const double* __restrict x, const double* __restrict s,
               const double* __restrict c, int count, fcomplex* oc) {
  const float* __restrict z = reinterpret_cast<const float*>(zc);
  float* __restrict out = reinterpret_cast<float*>(oc);
  for (int u = 0; u < count; ++u) {
    const double f = std::floor(x[u]);
    const bool in = f >= 0.0 && f < bins;
    const int p = in ? static_cast<int>(f) : 0;
    const double t = x[u] - f;
    const double mr = (1.0 - t) * z[2 * p] - t * z[2 * p + 2];
    const double mi = (1.0 - t) * z[2 * p + 1] - t * z[2 * p + 3];
    const double re = mr * c[u] - mi * s[u], im = mr * s[u] + mi * c[u];
    out[2 * u] = in ? static_cast<float>(re) : 0.0f;
    out[2 * u + 1] = in ? static_cast<float>(im) : 0.0f;
  }
}

const LineKernels kernels{reference_phase, node_weights, output_bins, two_point};
}  // namespace base_isa

const LineKernels& line_kernels() {
  static const LineKernels& chosen = [] () -> const LineKernels& {
    __builtin_cpu_init();
    if (__builtin_cpu_supports("avx2") && __builtin_cpu_supports("fma")) return avx2::kernels;
    return base_isa::kernels;
  }();
  return chosen;
}

}  // namespace sar::stripmap::detail

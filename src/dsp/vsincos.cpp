#include "dsp/vsincos.hpp"

#include <emmintrin.h>
#include <sleef.h>

#include <algorithm>
#include <array>
#include <cmath>
#include <stdexcept>

namespace sar::dsp {

namespace detail {
// Two phases at a time on the x86-64 baseline; the tail through the same vector function, so
// a phase gives the same bytes wherever it stands in the array.
void sincos_sse2(const double* phase, double* s, double* c, std::size_t n) {
  std::size_t i = 0;
  for (; i + 2 <= n; i += 2) {
    const Sleef___m128d_2 r = Sleef_sincosd2_u35sse2(_mm_loadu_pd(phase + i));
    _mm_storeu_pd(s + i, r.x);
    _mm_storeu_pd(c + i, r.y);
  }
  if (i < n) {
    const Sleef___m128d_2 r = Sleef_sincosd2_u35sse2(_mm_set_pd(0.0, phase[i]));
    s[i] = _mm_cvtsd_f64(r.x);
    c[i] = _mm_cvtsd_f64(r.y);
  }
}
void rotate_sse2(fcomplex* x, const double* phase, const double* weight, std::size_t n) {
  constexpr std::size_t kSlice = 256;
  std::array<double, kSlice> s{}, c{};
  for (std::size_t o = 0; o < n; o += kSlice) {
    const std::size_t m = std::min(kSlice, n - o);
    sincos_sse2(phase + o, s.data(), c.data(), m);
    if (weight) {
      for (std::size_t i = 0; i < m; ++i) {
        c[i] *= weight[o + i];
        s[i] *= weight[o + i];
      }
    }
    fcomplex* v = x + o;
    for (std::size_t i = 0; i < m; ++i) {
      const double re = v[i].real(), im = v[i].imag();
      v[i] = fcomplex(static_cast<float>(re * c[i] - im * s[i]), static_cast<float>(re * s[i] + im * c[i]));
    }
  }
}

}  // namespace detail

namespace {

using Kernel = void (*)(const double*, double*, double*, std::size_t);

Kernel choose() {
  __builtin_cpu_init();
  if (__builtin_cpu_supports("avx2") && __builtin_cpu_supports("fma")) return detail::sincos_avx2;
  return detail::sincos_sse2;
}

Kernel kernel() {
  static const Kernel k = choose();
  return k;
}

}  // namespace

const char* sincos_path() { return kernel() == detail::sincos_avx2 ? "avx2" : "sse2"; }

void sincos_n(std::span<const double> phase, std::span<double> s, std::span<double> c) {
  if (s.size() < phase.size() || c.size() < phase.size())
    throw std::invalid_argument("sincos_n: output shorter than the phases");
  kernel()(phase.data(), s.data(), c.data(), phase.size());
}

void rotate_n(std::span<fcomplex> x, std::span<const double> phase, std::span<const double> weight) {
  if (phase.size() < x.size() || (!weight.empty() && weight.size() < x.size()))
    throw std::invalid_argument("rotate_n: phases or weights shorter than the samples");
  const double* w = weight.empty() ? nullptr : weight.data();
  if (kernel() == detail::sincos_avx2)
    detail::rotate_avx2(x.data(), phase.data(), w, x.size());
  else
    detail::rotate_sse2(x.data(), phase.data(), w, x.size());
}

void rotate_by(std::span<fcomplex> x, std::span<const dcomplex> phasor) {
  if (phasor.size() < x.size()) throw std::invalid_argument("rotate_by: fewer phasors than samples");
  float* v = reinterpret_cast<float*>(x.data());
  const double* p = reinterpret_cast<const double*>(phasor.data());
  for (std::size_t i = 0; i < x.size(); ++i) {
    const double re = v[2 * i], im = v[2 * i + 1], c = p[2 * i], s = p[2 * i + 1];
    v[2 * i] = static_cast<float>(re * c - im * s);
    v[2 * i + 1] = static_cast<float>(re * s + im * c);
  }
}

}  // namespace sar::dsp

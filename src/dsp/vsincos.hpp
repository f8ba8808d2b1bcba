#pragma once
// Vector sine and cosine in double precision for the per-sample phase terms of the focusing
// kernels: SLEEF's vector functions within 3.5 ulp (a few parts in 1e16, far below the float
// samples' own rounding, in 60 % of the time of the 1-ulp ones), four phases at a time where
// the processor has AVX2 and FMA, two at a time otherwise. The choice is made once per process, so every
// call of a run, on any thread, gives the same bytes.
#include <cstddef>
#include <span>

#include "dsp/complex.hpp"

namespace sar::dsp {

/// s[i] = sin(phase[i]), c[i] = cos(phase[i]) for i < phase.size(). s and c must be as long
/// as phase (throws std::invalid_argument otherwise).
void sincos_n(std::span<const double> phase, std::span<double> s, std::span<double> c);

/// x[i] = weight[i] exp(j phase[i]) x[i], the product in double precision, rounded to float.
/// An empty weight counts as all ones. Spans as long as x (throws std::invalid_argument).
void rotate_n(std::span<fcomplex> x, std::span<const double> phase, std::span<const double> weight = {});

/// x[i] = phasor[i] x[i], the product in double precision, rounded to float: for a turn that is
/// the same on many rows, whose phasors are made once. phasor as long as x (throws
/// std::invalid_argument otherwise).
void rotate_by(std::span<fcomplex> x, std::span<const dcomplex> phasor);

/// Name of the vector path in use ("avx2" or "sse2"), for logs and benchmarks.
const char* sincos_path();

namespace detail {
void sincos_avx2(const double* phase, double* s, double* c, std::size_t n);
void sincos_sse2(const double* phase, double* s, double* c, std::size_t n);
/// x[i] = weight[i] exp(j phase[i]) x[i] (weight may be null: ones), as rotate_n.
void rotate_avx2(fcomplex* x, const double* phase, const double* weight, std::size_t n);
void rotate_sse2(fcomplex* x, const double* phase, const double* weight, std::size_t n);
}  // namespace detail

}  // namespace sar::dsp

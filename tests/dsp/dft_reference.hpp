#pragma once
// Direct double-precision sums that the kit's transforms are checked against.
#include <cmath>
#include <complex>
#include <cstdint>
#include <numbers>
#include <random>
#include <vector>

#include "dsp/fft.hpp"

namespace sar::dsp::testing {

using cd = std::complex<double>;

/// X[k] = sum_n x[n] exp(sign j 2 pi k n / L), exact twiddle angles through k n mod L.
inline std::vector<cd> direct_dft(const std::vector<cd>& x, int sign) {
  const std::int64_t L = static_cast<std::int64_t>(x.size());
  std::vector<cd> X(x.size()), w(x.size());
  for (std::int64_t m = 0; m < L; ++m) {
    const double ang = sign * 2.0 * std::numbers::pi * static_cast<double>(m) / static_cast<double>(L);
    w[static_cast<std::size_t>(m)] = cd(std::cos(ang), std::sin(ang));
  }
  for (std::int64_t k = 0; k < L; ++k) {
    cd s = 0;
    for (std::int64_t n = 0; n < L; ++n) s += x[static_cast<std::size_t>(n)] * w[static_cast<std::size_t>((k * n) % L)];
    X[static_cast<std::size_t>(k)] = s;
  }
  return X;
}

/// Uniform complex noise in the unit square, reproducible per seed.
inline cvector random_samples(std::size_t n, unsigned seed) {
  std::mt19937 gen(seed);
  std::uniform_real_distribution<float> u(-1.0f, 1.0f);
  cvector v(n);
  for (auto& s : v) s = {u(gen), u(gen)};
  return v;
}

/// ||a - b|| / ||b|| over paired samples.
inline double relative_error(const std::vector<cd>& a, const std::vector<cd>& b) {
  double num = 0, den = 0;
  for (std::size_t i = 0; i < a.size(); ++i) {
    num += std::norm(a[i] - b[i]);
    den += std::norm(b[i]);
  }
  return den > 0 ? std::sqrt(num / den) : std::sqrt(num);
}

}  // namespace sar::dsp::testing

#include "multilook/strip_detect.hpp"

#include <algorithm>
#include <cmath>
#include <numbers>
#include <stdexcept>

namespace sar::multilook {

int looked_size(int n, int f) {
  if (n <= 0 || f <= 0) return 0;
  return n / f + (n % f != 0 ? 1 : 0);
}

RangeLookDetector::RangeLookDetector(int samples, int looks) : samples_(samples), looks_(looks) {
  if (samples < 1 || looks < 1) throw std::invalid_argument("range look detector: samples and looks must be >= 1");
  n_ = dsp::genpow(samples, 1);
  if (n_ <= 0 || n_ > (1 << 29)) throw std::invalid_argument("range look detector: line too long");
  const int out = looked_size(samples, looks);
  cells_.resize(static_cast<std::size_t>(out));
  for (int m = 0; m < out; ++m) {
    const int first = 2 * m * looks;
    const int last = std::min(2 * (m + 1) * looks, 2 * samples);
    cells_[static_cast<std::size_t>(m)] = last - first;
  }
  shift_.resize(static_cast<std::size_t>(n_));
  for (int k = 0; k < n_; ++k) {
    const int signedBin = 2 * k <= n_ ? k : k - n_;
    const double phase = -std::numbers::pi * signedBin / (2.0 * n_);
    shift_[static_cast<std::size_t>(k)] =
        fcomplex(static_cast<float>(std::cos(phase) / n_), static_cast<float>(std::sin(phase) / n_));
  }
  narrow_.assign(static_cast<std::size_t>(n_), fcomplex{});
  wide_.assign(2 * static_cast<std::size_t>(n_), fcomplex{});
  if (dsp::fft_makep_c(forward_, n_, n_, 1, 1, 1, 0, 1) != 0 ||
      dsp::fft_makep_c(backward_, 2 * n_, 2 * n_, 1, 1, -2, 0, 1) != 0)
    throw std::runtime_error("range look detector: no transform plan");
}

void RangeLookDetector::add_line(std::span<const fcomplex> line, std::span<double> sum) {
  if (line.size() < static_cast<std::size_t>(samples_) || sum.size() < cells_.size())
    throw std::length_error("range look detector: short buffer");
  std::copy_n(line.begin(), samples_, narrow_.begin());
  std::fill(narrow_.begin() + samples_, narrow_.end(), fcomplex{});
  dsp::pfft_c(forward_, narrow_);
  std::fill(wide_.begin(), wide_.end(), fcomplex{});
  const std::size_t n = static_cast<std::size_t>(n_);
  for (std::size_t k = 0; k < n; ++k) {
    const std::size_t to = 2 * k <= n ? k : k + n;  // negative bins to the top of the wide spectrum
    wide_[to] = narrow_[k] * shift_[k];
  }
  dsp::pfft_c(backward_, wide_);
  std::size_t j = 0;
  for (std::size_t m = 0; m < cells_.size(); ++m) {
    double acc = 0.0;
    for (int c = 0; c < cells_[m]; ++c, ++j) acc += std::norm(wide_[j]);
    sum[m] += acc;
  }
}

float look_amplitude(double sum, int rows, int cells) {
  if (rows <= 0 || cells <= 0) return 0.0f;
  return static_cast<float>(std::sqrt(sum / (static_cast<double>(rows) * cells)));
}

void presum_block(std::span<const fcomplex> block, int rows, int samples, int rangeLooks, std::span<fcomplex> out) {
  if (rows < 1 || samples < 1 || rangeLooks < 1) throw std::invalid_argument("presum: sizes must be >= 1");
  const int outSamples = samples / rangeLooks;
  if (block.size() < static_cast<std::size_t>(rows) * samples || out.size() < static_cast<std::size_t>(outSamples))
    throw std::length_error("presum: short buffer");
  const double scale = 1.0 / (static_cast<double>(rows) * rangeLooks);
  for (int m = 0; m < outSamples; ++m) {
    std::complex<double> acc{};
    for (int r = 0; r < rows; ++r) {
      const fcomplex* row = block.data() + static_cast<std::size_t>(r) * samples + static_cast<std::size_t>(m) * rangeLooks;
      for (int c = 0; c < rangeLooks; ++c) acc += std::complex<double>(row[c]);
    }
    out[static_cast<std::size_t>(m)] = fcomplex(static_cast<float>(acc.real() * scale), static_cast<float>(acc.imag() * scale));
  }
}

}  // namespace sar::multilook

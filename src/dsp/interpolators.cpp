#include "dsp/interpolators.hpp"

#include <algorithm>
#include <cmath>
#include <cstdint>
#include <cstdio>
#include <numbers>
#include <stdexcept>
#include <type_traits>

#include "base/diagnostics.hpp"
#include "dsp/filters.hpp"

namespace sar::dsp {
namespace {

constexpr double kTwoPi = 2.0 * std::numbers::pi;

void require(const char* what, std::size_t have, int64_t rows, int64_t cols) {
  if (static_cast<int64_t>(have) >= rows * cols) return;
  char msg[160];
  std::snprintf(msg, sizeof msg, "%s: buffer holds %zu samples, %lld x %lld needed", what, have,
                static_cast<long long>(rows), static_cast<long long>(cols));
  throw std::invalid_argument(msg);
}

int round_half_away(double x) { return static_cast<int>(x >= 0.0 ? std::floor(x + 0.5) : std::ceil(x - 0.5)); }

/// Checks of a one-dimension resampling: 1 for two changed dimensions, 10 for bad sizes.
int check_sizes(int nIn, int mIn, int nOut, int mOut) {
  if (nIn < 1 || mIn < 1 || nOut < 1 || mOut < 1) return 10;
  if (nIn != nOut && mIn != mOut) return 1;
  if (nOut < nIn || mOut < mIn) return 10;
  return 0;
}

template <class T>
int linear(std::span<const T> data, int nIn, int mIn, int nOut, int mOut, std::span<T> output) {
  if (int st = check_sizes(nIn, mIn, nOut, mOut)) return st;
  require("interp_lin", data.size(), nIn, mIn);
  require("interp_lin", output.size(), nOut, mOut);
  const bool alongRows = mOut != mIn;
  const int len = alongRows ? mIn : nIn;
  const int len2 = alongRows ? mOut : nOut;
  const int count = alongRows ? nIn : mIn;
  const int64_t inStep = alongRows ? 1 : mIn, outStep = alongRows ? 1 : mOut;
  const int f = len2 / len;
  using Scalar = std::conditional_t<std::is_same_v<T, fcomplex>, float, T>;
  for (int c = 0; c < count; ++c) {
    const T* a = data.data() + (alongRows ? static_cast<int64_t>(c) * mIn : c);
    T* o = output.data() + (alongRows ? static_cast<int64_t>(c) * mOut : c);
    for (int i = 0; i < len; ++i) {
      const T ai = a[i * inStep];
      o[static_cast<int64_t>(f) * i * outStep] = ai;
      for (int k = 1; k < f; ++k) {
        const T v = i + 1 < len ? ai + (a[(i + 1) * inStep] - ai) * (static_cast<Scalar>(k) / static_cast<Scalar>(f)) : ai;
        o[(static_cast<int64_t>(f) * i + k) * outStep] = v;
      }
    }
    const T last = a[(len - 1) * inStep];
    for (int j = f * len; j < len2; ++j) o[j * outStep] = last;
  }
  return 0;
}

}  // namespace

// ---------------------------------------------------------------------------- interp

int interp::setplans(int nIn, int mIn, int nOut, int mOut) {
  destroyplans();
  if (int st = check_sizes(nIn, mIn, nOut, mOut)) return st;
  nIn_ = nIn;
  mIn_ = mIn;
  nOut_ = nOut;
  mOut_ = mOut;
  if (nIn == nOut && mIn == mOut) {
    planned_ = true;
    return 0;
  }
  int st = 0;
  if (mOut != mIn) {
    st = fft_makep_c(forward_, mIn, mIn, nIn, nIn, 1, 0, 1);
    if (st == 0) st = fft_makep_c(backward_, mOut, mOut, nOut, nOut, -1, 0, 1);
  } else {
    st = fft_makep_c(forward_, mIn, mIn, nIn, nIn, 0, 1, 1);
    if (st == 0) st = fft_makep_c(backward_, mOut, mOut, nOut, nOut, 0, -1, 1);
  }
  if (st != 0) {
    destroyplans();
    return 10;
  }
  planned_ = true;
  return 0;
}

int interp::destroyplans() {
  fft_destp_c(forward_);
  fft_destp_c(backward_);
  planned_ = false;
  return 0;
}

int interp::interpft(std::span<fcomplex> data, int nIn, int mIn, int nOut, int mOut, std::span<fcomplex> output) {
  if (int st = setplans(nIn, mIn, nOut, mOut)) return st;
  const int st = interpft_p(data, output);
  destroyplans();
  return st;
}

int interp::interpft_p(std::span<fcomplex> data, std::span<fcomplex> output) {
  if (!planned_) return 10;
  require("interpft", data.size(), nIn_, mIn_);
  require("interpft", output.size(), nOut_, mOut_);
  if (nIn_ == nOut_ && mIn_ == mOut_) {
    std::copy(data.begin(), data.begin() + static_cast<std::ptrdiff_t>(nIn_) * mIn_, output.begin());
    return 0;
  }
  pfft_c(forward_, data);
  const bool alongRows = mOut_ != mIn_;
  const int n = alongRows ? mIn_ : nIn_;
  const int n2 = alongRows ? mOut_ : nOut_;
  const int count = alongRows ? nIn_ : mIn_;
  const int64_t inStep = alongRows ? 1 : mIn_, outStep = alongRows ? 1 : mOut_;
  const int h = n % 2 == 1 ? (n + 1) / 2 : n / 2 + 1;
  for (int c = 0; c < count; ++c) {
    const fcomplex* a = data.data() + (alongRows ? static_cast<int64_t>(c) * mIn_ : c);
    fcomplex* o = output.data() + (alongRows ? static_cast<int64_t>(c) * mOut_ : c);
    for (int k = 0; k < n2; ++k) o[k * outStep] = fcomplex(0.0f, 0.0f);
    for (int k = 0; k < h; ++k) o[k * outStep] = a[k * inStep];
    for (int k = h; k < n; ++k) o[(k - n + n2) * outStep] = a[k * inStep];
    if (n % 2 == 0) {
      // The Nyquist term belongs to both signs of frequency: half to each.
      const fcomplex half = a[(h - 1) * inStep] * 0.5f;
      o[(h - 1) * outStep] = half;
      o[(h - n + n2 - 1) * outStep] = half;
    }
  }
  pfft_c(backward_, output);
  const float gain = static_cast<float>(static_cast<double>(n2) / n);
  for (int64_t k = 0; k < static_cast<int64_t>(nOut_) * mOut_; ++k) output[static_cast<std::size_t>(k)] *= gain;
  return 0;
}

int interp::interp_lin(std::span<const fcomplex> data, int nIn, int mIn, int nOut, int mOut,
                       std::span<fcomplex> output) {
  return linear<fcomplex>(data, nIn, mIn, nOut, mOut, output);
}
int interp::interp_lin(std::span<const float> data, int nIn, int mIn, int nOut, int mOut, std::span<float> output) {
  return linear<float>(data, nIn, mIn, nOut, mOut, output);
}
int interp::interp_lin(std::span<const double> data, int nIn, int mIn, int nOut, int mOut, std::span<double> output) {
  return linear<double>(data, nIn, mIn, nOut, mOut, output);
}

// ---------------------------------------------------------------------------- interp2D

void interp2D::setCentre(double fx, double fy) {
  fx_ = fx;
  fy_ = fy;
  mode_ = -1;
}

int interp2D::prepare(int mode) {
  if (mode == mode_) return 0;
  if (P_ < 3 || P_ % 2 == 0) return 10;
  const double step = 1.0 / (P_ - 1);
  std::vector<double> real;
  if (mode == 0) {
    std::vector<fcomplex> bank(static_cast<std::size_t>(P_) * static_cast<std::size_t>(std::max(N_, 1)));
    if (int st = MakeGLSlowpass(bank, N_, P_, B_)) return st;
    taps_ = N_;
    real.resize(bank.size());
    // The bank carries the phase of each row's position on the half-rate carrier; the real
    // baseband taps are what is left without it.
    for (int r = 0; r < P_; ++r) {
      const double pos = r * step - 0.5;
      const fcomplex unrot(static_cast<float>(std::cos(std::numbers::pi * pos)), static_cast<float>(std::sin(std::numbers::pi * pos)));
      for (int t = 0; t < N_; ++t) {
        const std::size_t k = static_cast<std::size_t>(r) * N_ + t;
        real[k] = (bank[k] * unrot).real();
      }
    }
  } else if (mode == 1) {
    taps_ = 3;
    real.resize(static_cast<std::size_t>(P_) * 3);
    for (int r = 0; r < P_; ++r) {
      const double d = r * step - 0.5;
      real[static_cast<std::size_t>(r) * 3 + 0] = d * (d - 1.0) / 2.0;
      real[static_cast<std::size_t>(r) * 3 + 1] = 1.0 - d * d;
      real[static_cast<std::size_t>(r) * 3 + 2] = d * (d + 1.0) / 2.0;
    }
  } else {
    return 10;
  }
  // Range and azimuth copies, each moved to its band centre: the tap at t reads the sample at
  // distance t - n - d from the wanted point, whose carrier phase it takes out.
  const int n = (taps_ - 1) / 2;
  range_.resize(real.size());
  azimuth_.resize(real.size());
  for (int r = 0; r < P_; ++r) {
    const double d = r * step - 0.5;
    for (int t = 0; t < taps_; ++t) {
      const std::size_t k = static_cast<std::size_t>(r) * taps_ + t;
      const double ax = -kTwoPi * fx_ * (t - n - d);
      const double ay = -kTwoPi * fy_ * (t - n - d);
      range_[k] = fcomplex(static_cast<float>(real[k] * std::cos(ax)), static_cast<float>(real[k] * std::sin(ax)));
      azimuth_[k] = fcomplex(static_cast<float>(real[k] * std::cos(ay)), static_cast<float>(real[k] * std::sin(ay)));
    }
  }
  mode_ = mode;
  return 0;
}

fcomplex interp2D::at(int n, int m, std::span<const fcomplex> data, double x, double y) const {
  if (!std::isfinite(x) || !std::isfinite(y)) return {0.0f, 0.0f};
  const int ix = round_half_away(x), iy = round_half_away(y);
  if (ix < 0 || ix >= n || iy < 0 || iy >= m) return {0.0f, 0.0f};
  const double s = 1.0 / (P_ - 1);
  const int rx = std::clamp(P_ / 2 + round_half_away((x - ix) / s), 0, P_ - 1);
  const int ry = std::clamp(P_ / 2 + round_half_away((y - iy) / s), 0, P_ - 1);
  const int half = (taps_ - 1) / 2;
  const fcomplex* hx = range_.data() + static_cast<std::size_t>(rx) * taps_;
  const fcomplex* hy = azimuth_.data() + static_cast<std::size_t>(ry) * taps_;
  fcomplex sum(0.0f, 0.0f);
  for (int ty = 0; ty < taps_; ++ty) {
    const int line = iy + ty - half;
    if (line < 0 || line >= m) continue;
    const fcomplex* row = data.data() + static_cast<int64_t>(line) * n;
    fcomplex acc(0.0f, 0.0f);
    for (int tx = 0; tx < taps_; ++tx) {
      const int col = ix + tx - half;
      if (col >= 0 && col < n) acc += row[col] * hx[tx];
    }
    sum += acc * hy[ty];
  }
  return sum;
}

int interp2D::interp2(int n, int m, std::span<const fcomplex> data, double x0, double y0, double dx, double dy,
                      int across, int down, std::span<fcomplex> output) {
  return interp2(n, m, data, x0, y0, dx, dy, across, down, output, 0);
}

int interp2D::interp2(int n, int m, std::span<const fcomplex> data, double x0, double y0, double dx, double dy,
                      int across, int down, std::span<fcomplex> output, int mode) {
  if (n < 1 || m < 1 || across < 0 || down < 0) return 10;
  require("interp2", data.size(), m, n);
  require("interp2", output.size(), down, across);
  if (int st = prepare(mode)) return st;
  for (int j = 0; j < down; ++j)
    for (int i = 0; i < across; ++i)
      output[static_cast<std::size_t>(j) * across + i] = at(n, m, data, x0 + i * dx, y0 + j * dy);
  return 0;
}

int interp2D::interp2(int n, int m, std::span<const fcomplex> data, std::span<const double> xs,
                      std::span<const double> ys, int across, int down, std::span<fcomplex> output) {
  return interp2(n, m, data, xs, ys, across, down, output, 0);
}

int interp2D::interp2(int n, int m, std::span<const fcomplex> data, std::span<const double> xs,
                      std::span<const double> ys, int across, int down, std::span<fcomplex> output, int mode) {
  if (n < 1 || m < 1 || across < 0 || down < 0) return 10;
  require("interp2", data.size(), m, n);
  require("interp2", output.size(), down, across);
  require("interp2", xs.size(), 1, across);
  require("interp2", ys.size(), 1, down);
  if (int st = prepare(mode)) return st;
  for (int j = 0; j < down; ++j)
    for (int i = 0; i < across; ++i)
      output[static_cast<std::size_t>(j) * across + i] =
          at(n, m, data, xs[static_cast<std::size_t>(i)], ys[static_cast<std::size_t>(j)]);
  return 0;
}

// ---------------------------------------------------------------------------- demodulationPhase

double demodulationPhase::phase(double line, double sample) const {
  const double x = line, y = sample;
  return -kTwoPi * ((y * c3 + c2) * x + (x * c1 + c0) * y);
}

int demodulationPhase::applyDemodPhase(double line, double sample, fcomplex& value) const {
  const double p = phase(line, sample);
  value *= fcomplex(static_cast<float>(std::cos(p)), static_cast<float>(std::sin(p)));
  return 0;
}

int demodulationPhase::applyModPhase(double line, double sample, fcomplex& value) const {
  const double p = phase(line, sample);
  value *= fcomplex(static_cast<float>(std::cos(p)), static_cast<float>(-std::sin(p)));
  return 0;
}

}  // namespace sar::dsp

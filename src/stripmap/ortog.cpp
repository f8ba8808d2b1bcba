#include <algorithm>
#include <cmath>
#include <complex>
#include <span>
#include <vector>

#include "stripmap/range_focus.hpp"

namespace sar::stripmap {

namespace {

constexpr double kKeep = 0.99;
constexpr double kTake = 1.0 - 0.99;

double smooth(double old, double now) { return kKeep * old + kTake * now; }

}  // namespace

OrtogState& ortog_state() {
  static OrtogState state;
  return state;
}

namespace {

// Sums of one line's samples and of their squares and products, each over four interleaved
// lanes added in a fixed order: the same bytes whatever thread computes them.
struct Moments {
  double i = 0.0, q = 0.0, ii = 0.0, qq = 0.0, iq = 0.0;
};

Moments line_moments(const std::complex<float>* x, int32_t samples) {
  double a[5][4] = {};
  int32_t k = 0;
  for (; k + 4 <= samples; k += 4) {
    for (int j = 0; j < 4; ++j) {
      const double i = x[k + j].real(), q = x[k + j].imag();
      a[0][j] += i;
      a[1][j] += q;
      a[2][j] += i * i;
      a[3][j] += q * q;
      a[4][j] += i * q;
    }
  }
  for (int j = 0; k < samples; ++k, ++j) {
    const double i = x[k].real(), q = x[k].imag();
    a[0][j] += i;
    a[1][j] += q;
    a[2][j] += i * i;
    a[3][j] += q * q;
    a[4][j] += i * q;
  }
  const auto sum = [](const double* v) { return (v[0] + v[1]) + (v[2] + v[3]); };
  return {sum(a[0]), sum(a[1]), sum(a[2]), sum(a[3]), sum(a[4])};
}

// What one line gets: its means taken off, Q scaled by `gain`, then Q' = (Q - I s) inv.
struct Correction {
  bool apply = false;
  float meanI = 0.0f, meanQ = 0.0f;
  double gain = 1.0;
  bool rotate = false;
  double s = 0.0, inv = 1.0;
};

}  // namespace

// Per line: remove the DC bias of both channels, equalise Q's gain to I's, then take out the
// angle between the channels by Gram-Schmidt (I kept, Q' = (Q - I sin a) / cos a). A pure
// rotation of both channels would keep their correlation and correct nothing. All three terms
// come from running averages, so a single noisy line cannot throw them off.
//
// The running averages make the lines depend on each other, but only through five sums per
// line: those are taken in parallel, the averages then run over the lines one by one (a few
// operations a line), and the corrections are applied in parallel again. The energies and the
// correlation of the corrected channels follow from the sums of the raw samples by expanding
// the squares.
int ortogN(std::span<std::complex<float>> matrix, int32_t pitch, int32_t samples, int32_t lines, int32_t block) {
  OrtogState& st = ortog_state();
  if (block == 0) st.first = true;
  if (samples <= 0 || lines <= 0) return 0;
  const double n = samples;
  const auto row = [&](int32_t l) { return matrix.data() + static_cast<std::ptrdiff_t>(l) * pitch; };
  std::vector<Moments> moments(static_cast<std::size_t>(lines));
#pragma omp parallel for schedule(static)
  for (int32_t l = 0; l < lines; ++l) moments[static_cast<std::size_t>(l)] = line_moments(row(l), samples);

  std::vector<Correction> corrections(static_cast<std::size_t>(lines));
  for (int32_t l = 0; l < lines; ++l) {
    const Moments& m = moments[static_cast<std::size_t>(l)];
    Correction& c = corrections[static_cast<std::size_t>(l)];
    if (st.first) st = OrtogState{};
    const double mI = m.i / n, mQ = m.q / n;
    if (mI == 0.0) continue;
    st.meanI = st.first ? mI : smooth(st.meanI, mI);
    st.meanQ = st.first ? mQ : smooth(st.meanQ, mQ);
    c.apply = true;
    c.meanI = static_cast<float>(st.meanI);
    c.meanQ = static_cast<float>(st.meanQ);
    const double dI = c.meanI, dQ = c.meanQ;
    const double eI = std::max(m.ii - 2.0 * dI * m.i + n * dI * dI, 0.0);
    const double eQ = std::max(m.qq - 2.0 * dQ * m.q + n * dQ * dQ, 0.0);
    const double rI = std::sqrt(eI / n), rQ = std::sqrt(eQ / n);
    st.rmsI = st.first ? rI : smooth(st.rmsI, rI);
    st.rmsQ = st.first ? rQ : smooth(st.rmsQ, rQ);
    c.gain = st.rmsQ > 0.0 ? st.rmsI / st.rmsQ : 1.0;
    const double corr = c.gain * (m.iq - dQ * m.i - dI * m.q + n * dI * dQ);
    const double a = eI, b = c.gain * c.gain * eQ;
    double angle = 0.0;
    if (st.first) {
      st.correlation = corr;
      st.energyI = a;
      st.energyQ = b;
    } else {
      st.correlation = smooth(st.correlation, corr);
      st.energyI = smooth(st.energyI, a);
      st.energyQ = smooth(st.energyQ, b);
      const double sum = st.energyI + st.energyQ;
      if (sum > 0.0) angle = std::asin(std::clamp(2.0 * st.correlation / sum, -1.0, 1.0));
    }
    if (angle != 0.0) {
      c.rotate = true;
      c.s = std::sin(angle);
      c.inv = 1.0 / std::cos(angle);
    }
    st.first = false;
  }

#pragma omp parallel for schedule(static)
  for (int32_t l = 0; l < lines; ++l) {
    const Correction& c = corrections[static_cast<std::size_t>(l)];
    if (!c.apply) continue;
    std::complex<float>* x = row(l);
    for (int32_t k = 0; k < samples; ++k) {
      const float i = x[k].real() - c.meanI;
      float q = static_cast<float>(static_cast<double>(x[k].imag() - c.meanQ) * c.gain);
      if (c.rotate) q = static_cast<float>((static_cast<double>(q) - static_cast<double>(i) * c.s) * c.inv);
      x[k] = {i, q};
    }
  }
  return 0;
}

}  // namespace sar::stripmap

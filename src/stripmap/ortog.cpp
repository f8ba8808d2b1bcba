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

// The sums are in double precision; the vector reduction fixes its order of additions at
// compile time, so a line gives the same sums whatever thread takes it.
OrtogMoments ortog_moments(const std::complex<float>* x, int32_t samples) {
  const float* f = reinterpret_cast<const float*>(x);
  double si = 0.0, sq = 0.0, sii = 0.0, sqq = 0.0, siq = 0.0;
#pragma omp simd reduction(+ : si, sq, sii, sqq, siq)
  for (int32_t k = 0; k < samples; ++k) {
    const double i = f[2 * k], q = f[2 * k + 1];
    si += i;
    sq += q;
    sii += i * i;
    sqq += q * q;
    siq += i * q;
  }
  return {si, sq, sii, sqq, siq};
}

void ortog_apply(std::complex<float>* line, int32_t samples, const OrtogCorrection& c) {
  if (!c.apply) return;
  float* x = reinterpret_cast<float*>(line);
  if (c.rotate) {
#pragma omp simd
    for (int32_t k = 0; k < samples; ++k) {
      const float i = x[2 * k] - c.meanI;
      const auto q = static_cast<float>(static_cast<double>(x[2 * k + 1] - c.meanQ) * c.gain);
      x[2 * k] = i;
      x[2 * k + 1] = static_cast<float>((static_cast<double>(q) - static_cast<double>(i) * c.s) * c.inv);
    }
  } else {
#pragma omp simd
    for (int32_t k = 0; k < samples; ++k) {
      x[2 * k] -= c.meanI;
      x[2 * k + 1] = static_cast<float>(static_cast<double>(x[2 * k + 1] - c.meanQ) * c.gain);
    }
  }
}

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
void ortog_corrections(std::span<const OrtogMoments> lines, int32_t samples, int32_t block,
                       std::span<OrtogCorrection> out) {
  OrtogState& st = ortog_state();
  if (block == 0) st.first = true;
  const double n = samples;
  for (std::size_t l = 0; l < lines.size() && l < out.size(); ++l) {
    const OrtogMoments& sums = lines[l];
    const struct {
      double i, q, ii, qq, iq;
    } m{sums[0], sums[1], sums[2], sums[3], sums[4]};
    OrtogCorrection& c = out[l];
    c = OrtogCorrection{};
    if (samples <= 0) continue;
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
}

int ortogN(std::span<std::complex<float>> matrix, int32_t pitch, int32_t samples, int32_t lines, int32_t block) {
  if (block == 0) ortog_state().first = true;
  if (samples <= 0 || lines <= 0) return 0;
  const auto row = [&](int32_t l) { return matrix.data() + static_cast<std::ptrdiff_t>(l) * pitch; };
  std::vector<OrtogMoments> moments(static_cast<std::size_t>(lines));
#pragma omp parallel for schedule(static)
  for (int32_t l = 0; l < lines; ++l) moments[static_cast<std::size_t>(l)] = ortog_moments(row(l), samples);
  std::vector<OrtogCorrection> corrections(static_cast<std::size_t>(lines));
  ortog_corrections(moments, samples, block, corrections);
#pragma omp parallel for schedule(static)
  for (int32_t l = 0; l < lines; ++l) ortog_apply(row(l), samples, corrections[static_cast<std::size_t>(l)]);
  return 0;
}

}  // namespace sar::stripmap

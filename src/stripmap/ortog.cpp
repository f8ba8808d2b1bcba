#include <algorithm>
#include <cmath>
#include <complex>
#include <span>

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

// Per line: remove the DC bias of both channels, equalise Q's gain to I's, then take out the
// angle between the channels by Gram-Schmidt (I kept, Q' = (Q - I sin a) / cos a). A pure
// rotation of both channels would keep their correlation and correct nothing. All three terms
// come from running averages, so a single noisy line cannot throw them off.
int ortogN(std::span<std::complex<float>> matrix, int32_t pitch, int32_t samples, int32_t lines, int32_t block) {
  OrtogState& st = ortog_state();
  if (block == 0) st.first = true;
  if (samples <= 0) return 0;
  const double n = samples;
  for (int32_t l = 0; l < lines; ++l) {
    std::complex<float>* x = matrix.data() + static_cast<std::ptrdiff_t>(l) * pitch;
    if (st.first) st = OrtogState{};
    double sumI = 0.0, sumQ = 0.0;
    for (int32_t k = 0; k < samples; ++k) {
      sumI += x[k].real();
      sumQ += x[k].imag();
    }
    const double mI = sumI / n, mQ = sumQ / n;
    if (mI == 0.0) continue;
    st.meanI = st.first ? mI : smooth(st.meanI, mI);
    st.meanQ = st.first ? mQ : smooth(st.meanQ, mQ);
    const auto fI = static_cast<float>(st.meanI), fQ = static_cast<float>(st.meanQ);
    double eI = 0.0, eQ = 0.0;
    for (int32_t k = 0; k < samples; ++k) {
      x[k] = {x[k].real() - fI, x[k].imag() - fQ};
      eI += static_cast<double>(x[k].real()) * x[k].real();
      eQ += static_cast<double>(x[k].imag()) * x[k].imag();
    }
    const double rI = std::sqrt(eI / n), rQ = std::sqrt(eQ / n);
    st.rmsI = st.first ? rI : smooth(st.rmsI, rI);
    st.rmsQ = st.first ? rQ : smooth(st.rmsQ, rQ);
    const double gain = st.rmsQ > 0.0 ? st.rmsI / st.rmsQ : 1.0;
    double c = 0.0, a = 0.0, b = 0.0;
    for (int32_t k = 0; k < samples; ++k) {
      const double i = x[k].real();
      const double q = x[k].imag() * gain;
      x[k] = {x[k].real(), static_cast<float>(q)};
      c += i * q;
      a += i * i;
      b += q * q;
    }
    double angle = 0.0;
    if (st.first) {
      st.correlation = c;
      st.energyI = a;
      st.energyQ = b;
    } else {
      st.correlation = smooth(st.correlation, c);
      st.energyI = smooth(st.energyI, a);
      st.energyQ = smooth(st.energyQ, b);
      const double sum = st.energyI + st.energyQ;
      if (sum > 0.0) angle = std::asin(std::clamp(2.0 * st.correlation / sum, -1.0, 1.0));
    }
    if (angle != 0.0) {
      const double s = std::sin(angle), inv = 1.0 / std::cos(angle);
      for (int32_t k = 0; k < samples; ++k) {
        const double i = x[k].real(), q = x[k].imag();
        x[k] = {x[k].real(), static_cast<float>((q - i * s) * inv)};
      }
    }
    st.first = false;
  }
  return 0;
}

}  // namespace sar::stripmap

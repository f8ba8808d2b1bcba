// Wavelength diversity estimator. The azimuth spectrum at range frequency f_r is centred at
// fdc (f0 + f_r)/f0, so the lag-one azimuth phase grows linearly over the range band with a
// slope proportional to the absolute centroid. The slope is read as the peak of the transform
// of the per-bin phasors.
#include <algorithm>
#include <cmath>
#include <numbers>
#include <vector>

#include "base/diagnostics.hpp"
#include "doppler/dcest.hpp"
#include "dsp/fft.hpp"

namespace sar::doppler {

namespace detail {
/// Plans and bins, shared by all blocks (and threads) of a run.
struct WdarState {
  dsp::fft_plan rows;   ///< Blockl rows of Blocks samples, forward, out of place
  dsp::fft_plan slope;  ///< one row of L samples, forward, in place
  std::vector<char> used;
  int L = 0;
};
}  // namespace detail

namespace {
constexpr double kTwoPi = 2.0 * std::numbers::pi;

/// Working storage of one thread, kept from block to block.
struct Scratch {
  dsp::cvector spectrum;
  dsp::cvector line;
  std::vector<double> sumReal, sumImag;  ///< lag-one sums per range frequency
};

Scratch& scratch() {
  thread_local Scratch s;
  return s;
}
}  // namespace

std::vector<char> wdar_bins(int blocks, double rgBand) {
  std::vector<char> used(static_cast<std::size_t>(std::max(blocks, 0)), 0);
  // One integer bound for both signs of frequency: comparing i / Blocks with h and 1 - h in
  // floating point can take one bin more on one side.
  const int kmax = static_cast<int>(std::floor(rgBand / 2.0 * blocks + 1e-9));
  for (int i = 0; i < blocks; ++i) {
    const int k = i <= blocks / 2 ? i : i - blocks;
    if (std::abs(k) <= kmax) used[static_cast<std::size_t>(i)] = 1;
  }
  return used;
}

int wdar_init(dcestconf& conf) {
  base::Frame frame("wdar_init");
  conf.wdar.reset();
  if (conf.Blocks < 2 || conf.Blockl < 2 || !(conf.fs > 0.0)) return 10;
  auto st = std::make_shared<detail::WdarState>();
  if (int e = frame.check(dsp::fft_makep_c(st->rows, conf.Blocks, conf.Blocks, conf.Blockl, conf.Blockl, 1, 0, 0)))
    return e;
  st->used = wdar_bins(conf.Blocks, conf.RgBand);
  const int n = static_cast<int>(std::count(st->used.begin(), st->used.end(), 1));
  st->L = 1 << (static_cast<int>(std::trunc(std::log2(static_cast<double>(std::max(2000, n))))) + 1);
  if (int e = frame.check(dsp::fft_makep_c(st->slope, st->L, st->L, 1, 1, 1, 0, 1))) return e;
  conf.wdar = std::move(st);
  return 0;
}

void wdar_free(dcestconf& conf) { conf.wdar.reset(); }

int wdar_estimate(const dcestconf& conf, std::span<const fcomplex> block, double centreCycles, double& estimate) {
  if (!conf.wdar) return -1;
  const auto& st = *conf.wdar;
  const int ns = conf.Blocks, nl = conf.Blockl, L = st.L;
  if (block.size() < static_cast<std::size_t>(ns) * static_cast<std::size_t>(nl)) return 10;
  Scratch& work = scratch();
  work.spectrum.resize(static_cast<std::size_t>(ns) * static_cast<std::size_t>(nl));
  work.line.resize(static_cast<std::size_t>(L));
  work.sumReal.resize(static_cast<std::size_t>(ns));
  work.sumImag.resize(static_cast<std::size_t>(ns));
  dsp::pfft_c(st.rows, block, work.spectrum);

  // Lag-one phase of every used range frequency, in cycles. The sums of all frequencies run
  // side by side along the lines (each still in line order), so that the spectrum is read row
  // by row.
  std::vector<double>& sr = work.sumReal;
  std::vector<double>& si = work.sumImag;
  std::fill(sr.begin(), sr.end(), 0.0);
  std::fill(si.begin(), si.end(), 0.0);
  for (int l = 0; l + 1 < nl; ++l) {
    const float* a = reinterpret_cast<const float*>(work.spectrum.data() + static_cast<std::size_t>(l) * ns);
    const float* b = a + 2 * static_cast<std::size_t>(ns);
    for (int i = 0; i < ns; ++i) {
      const double ar = a[2 * i], ai = a[2 * i + 1], br = b[2 * i], bi = b[2 * i + 1];
      sr[static_cast<std::size_t>(i)] += ar * br + ai * bi;
      si[static_cast<std::size_t>(i)] += ar * bi - ai * br;
    }
  }
  std::vector<double> phase(static_cast<std::size_t>(ns), 0.0);
  for (int i = 1; i < ns; ++i)
    if (st.used[static_cast<std::size_t>(i)])
      phase[static_cast<std::size_t>(i)] = std::atan2(si[static_cast<std::size_t>(i)], sr[static_cast<std::size_t>(i)]) / kTwoPi;
  phase[0] = centreCycles;

  // Phasors in ascending range frequency (negative half first), zero padded to L.
  std::fill(work.line.begin(), work.line.end(), dsp::fcomplex(0.0f, 0.0f));
  for (int i = 0; i < ns; ++i) {
    if (!st.used[static_cast<std::size_t>(i)]) continue;
    const int pos = (i + ns / 2) % ns;
    const double p = kTwoPi * phase[static_cast<std::size_t>(i)];
    work.line[static_cast<std::size_t>(pos)] = dsp::fcomplex(static_cast<float>(std::cos(p)), static_cast<float>(std::sin(p)));
  }
  dsp::pfft_c(st.slope, work.line);
  // The slope is signed: the peak is read on the half-swapped spectrum, index L/2 being zero.
  dsp::fftshift(work.line, L, 1);
  int m = 0;
  float best = -1.0f;
  for (int k = 0; k < L; ++k) {
    const float v = std::abs(work.line[static_cast<std::size_t>(k)]);
    if (v > best) {
      best = v;
      m = k;
    }
  }
  const double scale = static_cast<double>(ns) / L;
  double e = (m - L / 2) * scale;
  if (m > 0 && m <= L - 2) {
    const double y0 = std::abs(work.line[static_cast<std::size_t>(m - 1)]);
    const double y1 = std::abs(work.line[static_cast<std::size_t>(m)]);
    const double y2 = std::abs(work.line[static_cast<std::size_t>(m + 1)]);
    const double den = y0 - 2.0 * y1 + y2;
    if (den != 0.0) e += 0.5 * (y0 - y2) / den * scale;
  }
  estimate = conf.carrier / conf.fs * e;
  return 0;
}

}  // namespace sar::doppler

// Multi-look beat frequency estimator. Two range looks of a bright scatterer, separated by s in
// range frequency, see its range migration as a phase: their product beats at the absolute
// centroid times s fs / f0 along azimuth. The beat spectrum is zoomed by a chirp-Z transform onto
// the frequencies of the ambiguities between Minamb and Maxamb.
#include <algorithm>
#include <cmath>
#include <cstdio>
#include <numbers>
#include <vector>

#include "base/diagnostics.hpp"
#include "doppler/dcest.hpp"
#include "dsp/czt.hpp"
#include "dsp/filters.hpp"

namespace sar::doppler {

namespace detail {
struct MlbfState {
  int Lf = 0;
  std::vector<double> separations;                // s[i], fractions of fs
  std::vector<std::vector<fcomplex>> upper, lower;  // reversed band-pass filters per look pair
  bool zoomReady = false;
  dsp::czt_plan zoom;
  int M = 0;
  double fstart = 0.0;
};
}  // namespace detail

namespace {
constexpr double kPi = std::numbers::pi;
}

int multimlbf_init(dcestconf& conf) {
  base::Frame frame("multimlbf_init");
  conf.mlbf.reset();
  if (conf.Nummlbf < 1) return 10;
  if (!(conf.Lookrs != 0.0) || !(conf.RgBand > 0.0)) return 10;
  auto st = std::make_shared<detail::MlbfState>();
  int lf = conf.Flength;
  if (lf % 2 == 0) {
    ++lf;
    std::printf("\nWARNING from mlbf_init(): Remez filter length must be odd. Filter length is set to : %d.", lf);
  }
  if (lf < 3 || lf >= conf.Blocks) return 10;
  st->Lf = lf;
  const double B = conf.RgBand;
  const double pass = (conf.Lookbf * B - conf.Lookbt * B) / 2.0;
  const double stop = (conf.Lookbf * B + conf.Lookbt * B) / 2.0;
  std::vector<dsp::fcomplex> proto(static_cast<std::size_t>(lf));
  const double bands[4] = {0.0, pass, stop, 0.5};
  const double desired[2] = {1.0, 0.0};
  const double weights[2] = {conf.Lookrp / conf.Lookrs, 1.0};
  if (int e = frame.check(dsp::remezOBX(proto, lf, 2, bands, desired, weights))) return e;

  const int n = conf.Nummlbf;
  const double s0 = 2.0 * conf.Lookbf * B;
  const double ds = n == 1 ? 0.0 : ((1.0 - conf.Lookbf) * B - s0) / (n - 1);
  st->upper.assign(static_cast<std::size_t>(n), std::vector<fcomplex>(static_cast<std::size_t>(lf)));
  st->lower = st->upper;
  for (int i = 0; i < n; ++i) {
    const double s = s0 + i * ds;
    st->separations.push_back(s);
    for (int t = 0; t < lf; ++t) {
      const double a = (t - (lf - 1) / 2) * s * kPi;
      const double p = proto[static_cast<std::size_t>(t)].real();
      // Stored reversed, so that the dot product below is a convolution.
      st->upper[static_cast<std::size_t>(i)][static_cast<std::size_t>(lf - 1 - t)] =
          fcomplex(static_cast<float>(p * std::cos(a)), static_cast<float>(p * std::sin(a)));
      st->lower[static_cast<std::size_t>(i)][static_cast<std::size_t>(lf - 1 - t)] =
          fcomplex(static_cast<float>(p * std::cos(a)), static_cast<float>(-p * std::sin(a)));
    }
  }
  conf.mlbf = std::move(st);
  return 0;
}

int cirpZ_init(dcestconf& conf) {
  base::Frame frame("cirpZ_init");
  if (!conf.mlbf) return 1;
  auto& st = *conf.mlbf;
  if (!(conf.Dftstep > 0.0) || !(conf.carrier > 0.0)) return 10;
  const double sLast = st.separations.back();
  const double span = conf.fs / conf.carrier * std::fabs(conf.Maxamb - conf.Minamb) * sLast / conf.Dftstep;
  if (!(span < 1e7)) return 10;
  st.M = std::max(1, static_cast<int>(std::ceil(span)));
  st.fstart = conf.fs / conf.carrier * sLast * conf.Minamb;
  if (int e = frame.check(dsp::czt_makep_c(st.zoom, conf.Blockl, st.M))) return e;
  st.zoomReady = true;
  return 0;
}

void mlbf_free(dcestconf& conf) {
  if (conf.mlbf && conf.mlbf->zoomReady) dsp::czt_destp_c(conf.mlbf->zoom);
  conf.mlbf.reset();
}

int multimlbf(dcestconf& conf, std::span<const fcomplex> block, int index) {
  if (!conf.mlbf || !conf.mlbf->zoomReady) return 1;
  if (index < 0 || static_cast<std::size_t>(index) >= conf.mlbfBlocks.size()) return 10;
  auto& st = *conf.mlbf;
  auto& rec = conf.mlbfBlocks[static_cast<std::size_t>(index)];
  const int ns = conf.Blocks, nl = conf.Blockl, lf = st.Lf;
  const int decfac = std::max(1, conf.Decfac);
  const int no = ns - 2 * (lf / 2);
  if (no < 1) return 10;
  const int nd = (no + decfac - 1) / decfac;
  const int pairs = static_cast<int>(st.separations.size());
  rec.estimates.assign(static_cast<std::size_t>(pairs), 0.0);
  rec.quality.assign(static_cast<std::size_t>(pairs), 0.0);

  std::vector<dsp::fcomplex> beat(static_cast<std::size_t>(nd) * static_cast<std::size_t>(nl));
  std::vector<dsp::fcomplex> zoomed(static_cast<std::size_t>(nd) * static_cast<std::size_t>(st.M));
  std::vector<double> power(static_cast<std::size_t>(st.M));
  for (int i = 0; i < pairs; ++i) {
    std::printf("Evaluating MLBF %d of %d...", i + 1, pairs);
    const fcomplex* fu = st.upper[static_cast<std::size_t>(i)].data();
    const fcomplex* fl = st.lower[static_cast<std::size_t>(i)].data();
    bool anyZero = false;
    // Range looks on every Decfac-th output, their beat stored as one azimuth series per output.
    for (int l = 0; l < nl; ++l) {
      const fcomplex* row = block.data() + static_cast<std::size_t>(l) * static_cast<std::size_t>(ns);
      for (int j = 0; j < nd; ++j) {
        const fcomplex* x = row + static_cast<std::ptrdiff_t>(j) * decfac;
        fcomplex up(0.0f, 0.0f), lo(0.0f, 0.0f);
        for (int t = 0; t < lf; ++t) {
          up += x[t] * fu[t];
          lo += x[t] * fl[t];
        }
        const fcomplex b = up * std::conj(lo);
        anyZero = anyZero || (b.real() == 0.0f && b.imag() == 0.0f);
        beat[static_cast<std::size_t>(j) * static_cast<std::size_t>(nl) + static_cast<std::size_t>(l)] = b;
      }
    }
    if (!anyZero)
      for (auto& b : beat) b /= std::abs(b);
    if (int e = dsp::pczt_c(st.zoom, beat, zoomed, -2.0 * kPi * conf.Dftstep, 2.0 * kPi * st.fstart, nd)) return e;
    for (int k = 0; k < st.M; ++k) {
      double sum = 0.0;
      for (int j = 0; j < nd; ++j) sum += std::norm(zoomed[static_cast<std::size_t>(j) * static_cast<std::size_t>(st.M) + static_cast<std::size_t>(k)]);
      power[static_cast<std::size_t>(k)] = sum / nd / nl;
    }
    int k0 = 0;
    for (int k = 1; k < st.M; ++k)
      if (power[static_cast<std::size_t>(k)] > power[static_cast<std::size_t>(k0)]) k0 = k;
    double freq = k0 * conf.Dftstep;
    double peak = power[static_cast<std::size_t>(k0)];
    if (k0 > 0 && k0 < st.M - 1) {
      const double y0 = power[static_cast<std::size_t>(k0 - 1)], y1 = peak, y2 = power[static_cast<std::size_t>(k0 + 1)];
      const double den = y0 - 2.0 * y1 + y2;
      if (den != 0.0) {
        const double d = 0.5 * (y0 - y2) / den;
        freq = (k0 + d) * conf.Dftstep;
        peak = y1 - 0.25 * (y0 - y2) * d;
      }
    }
    const int guard = static_cast<int>(std::ceil(conf.Peakwid / conf.Dftstep / 2.0));
    double side = 0.0;
    for (int k = 0; k < st.M; ++k)
      if (std::abs(k - k0) > guard) side = std::max(side, power[static_cast<std::size_t>(k)]);
    const double s = st.separations[static_cast<std::size_t>(i)];
    rec.estimates[static_cast<std::size_t>(i)] = conf.carrier / conf.fs / s * (st.fstart + freq);
    rec.quality[static_cast<std::size_t>(i)] = side > 0.0 ? peak / side : 0.0;
    std::printf("estimation: %f... \n", rec.estimates[static_cast<std::size_t>(i)]);
  }
  return 0;
}

}  // namespace sar::doppler

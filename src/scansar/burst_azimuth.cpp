// Azimuth focusing of the bursts of one sub-swath.
//
// A burst of N echoes is Hamming weighted, padded to Nf = genpow(3 N) lines and compressed by
// the omega-K kernel in zero-Doppler geometry: row k of the focused block is zero-Doppler time
// t_b + k / PRF, modulo the block's period Nf / PRF. A target whose zero-Doppler time lies a
// long way from the burst (a burst sees targets over the whole beam) therefore lands on the
// block folded; its burst band (B = |Ka| N / PRF wide) sits at the Doppler it had in the burst,
// Ka (t_c - t0), t_c the burst centre.
//
// Placing the lines on the common time grid: per range column, the block is repeated along
// time over the span the burst's targets occupy, and multiplied by exp(j pi Ka (t - t_c)^2).
// That deramp brings each target's copy at its own time to baseband, while the copies one
// period away sit at multiples of Ka Nf / PRF >= 3 B. A low-pass that keeps |f| < 0.75 B and
// stops at 2 B removes those ghosts; the baseband signal, oversampled about PRF / B times, is
// then read at the output times by linear interpolation and given its phase back.
//
// De-scalloping: a target's level in a burst is the two-way antenna pattern at the Doppler it
// had there; each output line is divided by the pattern's amplitude at its Doppler (with the
// two PRF-aliased lobes, which also add power in a distributed scene). The gain's slope across
// a response would move its peak; the line is read where that move is undone. (A burst's
// time-bandwidth product is about 2, so its azimuth spectrum does not map the echo times to
// Doppler one to one, and the same gain applied bin by bin to the spectrum moves peaks alike.)
#include <algorithm>
#include <cmath>
#include <cstring>
#include <string>
#include <vector>

#include "base/diagnostics.hpp"
#include "base/run_services.hpp"
#include "dsp/fft.hpp"
#include "scansar/files.hpp"
#include "scansar/wide_swath.hpp"
#include "stripmap/azimuth_focus.hpp"
#include "base/constants.hpp"

namespace sar::scansar {
namespace {
constexpr int kRejected = 10;
using base::kPi;
constexpr double kC = base::kSpeedOfLight;
constexpr int kMargin = 32;
constexpr int32_t kScaleNode = 16;
constexpr double kPassBand = 0.75, kStopBand = 2.0;  // in burst bandwidths
constexpr double kReferenceBurst = 1.0 / 30.0;        // s of echoes a burst's weights stand for
}  // namespace

double half_window(const scansar& scan, const wsparm& par) {
  const double total = par.windowWidth1 > 0.0 ? 2.0 * (par.windowWidth1 + par.windowWidth2) : 2.0 * par.windowWidth2;
  return 0.5 * total * scan.cycleTime;
}

int burst_azimuth_focus(const std::string& dir, int s, const scansar& scan, wsparm& par, const DopplerEstimate& est,
                        const RangeFocused& focused) {
  base::Frame frame("burst_azimuth_focus");
  const auto i = static_cast<std::size_t>(s);
  const int32_t N = scan.echoes[i], M = focused.width;
  const double p = scan.prf[i], fs = scan.samplingRate, a = par.azimuthStep;
  const int32_t ov = par.rangeOverlap;
  const int32_t W = focused.validColumns - ov;
  const int32_t c0 = focused.firstValid;
  if (W < 1 || M < 1 || N < 2 || !(a > 0.0)) {
    base::report(base::kReportError, "Azimuth focusing SS" + std::to_string(s + 1) + ": " +
                                         std::to_string(focused.validColumns) + " valid columns, range overlap " +
                                         std::to_string(ov) + ": nothing to focus");
    return frame.check(kRejected);
  }
  const double outNear = focused.nearTime + (c0 + ov / 2) / fs;
  const int32_t Nf = dsp::genpow(std::max(par.burstPadding, 2) * N, 1);
  const double h = half_window(scan, par);

  // Column geometry of a Doppler granule, and the spread of the window centres across range
  // over every granule, which sets the lines a burst gives.
  const std::size_t granules = std::max<std::size_t>(1, std::min(est.granuleCentroid.size(), est.granuleRate.size()));
  auto centroidOf = [&](std::size_t g) { return est.granuleCentroid.size() > g ? est.granuleCentroid[g][i] : est.centroid[i]; };
  auto rateOf = [&](std::size_t g) { return est.granuleRate.size() > g ? est.granuleRate[g][i] : est.rate[i]; };
  std::vector<double> fdc(static_cast<std::size_t>(W)), ka(static_cast<std::size_t>(W));
  const auto mid = static_cast<std::size_t>(W / 2);
  double xMid = 0.0;
  auto columns = [&](std::size_t g) {
    const auto dc = centroidOf(g), rate = rateOf(g);
    for (int32_t c = 0; c < W; ++c) {
      const double x = outNear + c / fs - est.refTime;
      fdc[static_cast<std::size_t>(c)] = poly4(dc, x);
      ka[static_cast<std::size_t>(c)] = poly4(rate, x);
      if (!(ka[static_cast<std::size_t>(c)] < 0.0)) return false;
    }
    xMid = fdc[mid] / ka[mid];
    return true;
  };
  double lower = 0.0, upper = 0.0;
  for (std::size_t g = 0; g < granules; ++g) {
    if (!columns(g)) {
      base::report(base::kReportError, "Azimuth focusing SS" + std::to_string(s + 1) + ": Doppler rate not negative");
      return frame.check(kRejected);
    }
    for (std::size_t c = 0; c < fdc.size(); ++c) {
      const double d = -fdc[c] / ka[c] + xMid;
      lower = std::min(lower, d);
      upper = std::max(upper, d);
    }
  }
  GranuleLayout layout;
  layout.count = static_cast<int32_t>(granules);
  layout.referenceTime = est.granuleReference;
  layout.step = est.granuleStep;
  layout.length = std::max(1, par.granuleLength);
  std::size_t granule = 0;
  columns(granule);
  par.linesPerBurst[i] = static_cast<int32_t>(std::ceil((2.0 * h - lower + upper) / a)) + 1;
  const int32_t Lpb = par.linesPerBurst[i];

  // The burst's Hamming weight. The kernel's gain is that of a stripmap aperture (a uniform
  // scene keeps its level whatever the PRF), so a burst of N echoes comes out in proportion to its
  // length N / PRF; the sub-swaths' bursts differ in length (30 to 37 ms), which would step the
  // level of a uniform scene by up to 0.8 dB from one sub-swath to the next. The weights carry
  // the power of kReferenceBurst seconds of echoes instead, whatever N and the PRF.
  std::vector<float> weight(static_cast<std::size_t>(N));
  {
    const double n = N - 1, c = par.azimuthHamming;
    double sum = 0.0;
    std::vector<double> w(static_cast<std::size_t>(N));
    for (int32_t k = 0; k < N; ++k) {
      w[static_cast<std::size_t>(k)] = (1.0 - c) * std::cos(2.0 * kPi * (n / 2 - k) / n) + c;
      sum += w[static_cast<std::size_t>(k)] * w[static_cast<std::size_t>(k)];
    }
    const double norm = std::sqrt(sum / (p * kReferenceBurst));
    for (int32_t k = 0; k < N; ++k) weight[static_cast<std::size_t>(k)] = static_cast<float>(w[static_cast<std::size_t>(k)] / norm);
  }
  // Spread of the weight over the burst, echoes^2: the curvature of a response's peak,
  // |h(tau)|^2 ~ 1 - (2 pi Ka tau / PRF)^2 windowSpread, follows from it.
  double windowSpread = 0.0;
  {
    double sw = 0.0;
    for (int32_t k = 0; k < N; ++k) {
      const double dk = k - (N - 1) / 2.0;
      sw += weight[static_cast<std::size_t>(k)];
      windowSpread += weight[static_cast<std::size_t>(k)] * dk * dk;
    }
    windowSpread /= sw;
  }

  // Elevation antenna correction, one gain per range column of the block.
  std::vector<float> rangeGain(static_cast<std::size_t>(M), 1.0f);
  if (!par.elevation[i].amplitude.empty()) {
    envi_beam_corr(par.elevation[i], est.slantToElevation[i], 0.0, fs, rangeGain);
    float lo = rangeGain[static_cast<std::size_t>(c0)], hi = lo;
    for (int32_t j = c0; j < c0 + focused.validColumns && j < M; ++j) {
      lo = std::min(lo, rangeGain[static_cast<std::size_t>(j)]);
      hi = std::max(hi, rangeGain[static_cast<std::size_t>(j)]);
    }
    base::LogPrintf("SS%d: elevation correction %.2f to %.2f dB across the valid columns\n", s + 1,
                    20.0 * std::log10(lo), 20.0 * std::log10(hi));
  }

  ScallopModel scallop;
  scallop.lengthOverWavelength = par.antennaLength * scan.carrierFrequency / kC;
  scallop.halfWavelengthOverSpeed = 0.5 * (kC / scan.carrierFrequency) / est.satelliteSpeed;
  scallop.normalisedSinc = par.normalisedSinc;

  const int64_t burstBytes = 8 + 8 * static_cast<int64_t>(N) * M;
  ByteReader in(dir + "/rgfoc_ss" + std::to_string(s + 1), "range focused sub-swath");
  if (in.size() < burstBytes * scan.bursts) {
    base::report(base::kReportError, "Azimuth focusing SS" + std::to_string(s + 1) + ": the range focused file is short");
    return frame.check(kRejected);
  }
  ByteWriter out(dir + "/SS" + std::to_string(s + 1) + ".out");

  stripmap::wkparm wk;
  wk.carrier = scan.carrierFrequency;
  wk.fs = fs;
  wk.prf = p;
  wk.rangePadding = 1.0;
  wk.rate = {rateOf(granule)[0], rateOf(granule)[1], rateOf(granule)[2]};
  wk.rateReference = est.refTime;
  wk.AntennaLength = par.antennaLength;
  wk.chirpBandwidth = scan.chirpBandwidth[i];
  std::array<double, 5> dcPoly = centroidOf(granule);
  const int32_t Sb = std::max(dsp::genpow(std::min(M, par.samplesInBlock), 1), ov + 2);

  dsp::cvector block(static_cast<std::size_t>(Nf) * M);
  std::vector<fcomplex> rows(static_cast<std::size_t>(N) * M);
  std::vector<fcomplex> image(static_cast<std::size_t>(Lpb) * W);
  std::vector<unsigned char> line(17 + 8 * static_cast<std::size_t>(W));
  dsp::cvector z;
  std::vector<float> scaleTable, warpTable;
  par.firstLine[i] = 1000000;
  par.lastLine[i] = -1000000;
  par.statistics[i] = ImageStatistics{};
  par.earliestTime[i] = 1e20;
  par.latestTime[i] = 0.0;
  for (int32_t b = 0; b < scan.bursts; ++b) {
    if (b + 1 < par.firstBurst || b + 1 > par.lastBurst) {
      in.seek(burstBytes * (b + 1));
      continue;
    }
    in.seek(burstBytes * b);
    double near = 0.0;
    in.read(&near, 8);
    in.read(rows.data(), 8 * static_cast<int64_t>(rows.size()));
    base::LogPrintf("Azimuth focusing burst %d in sub-swath %d.\n", b + 1, s + 1);
    // The Doppler granule of the burst: its centroid and rate across range, the kernel's plane.
    if (const auto g = static_cast<std::size_t>(granule_of_burst(layout, scan, s, b)); g != granule) {
      granule = g;
      columns(granule);
      dcPoly = centroidOf(granule);
      wk.rate = {rateOf(granule)[0], rateOf(granule)[1], rateOf(granule)[2]};
    }
    std::fill(block.begin(), block.end(), fcomplex{});
    for (int32_t k = 0; k < N; ++k)
      for (int32_t j = 0; j < M; ++j)
        block[static_cast<std::size_t>(k) * M + j] =
            rows[static_cast<std::size_t>(k) * M + j] * (weight[static_cast<std::size_t>(k)] * rangeGain[static_cast<std::size_t>(j)]);
    wk.lines = Nf;
    wk.samples = M;
    wk.nearTime = focused.nearTime;
    wk.data = block;
    wk.azimuthShift = 0.0;
    wk.rangeShift = 0.0;
    wk.spectrumCentreFd = 0.0;
    stripmap::focazwk_result result;
    if (const int st = stripmap::multirg(wk, result, Sb, ov, dcPoly.data(), est.refTime); st != 0) return frame.check(st);

    // Burst timing relative to the scene's first line.
    const double tb = b * scan.cycleTime + scan.burstOffset[i];
    const double tc = tb + (N - 1) / (2.0 * p);
    const double lo = tc + lower - h - xMid, hi = tc + upper + h - xMid;
    const auto L0 = static_cast<int64_t>(std::floor(lo / a));
    const int64_t L1 = L0 + Lpb - 1;
    (void)hi;
    std::fill(image.begin(), image.end(), fcomplex{});
    // One span of block rows for every column: the union of the columns' windows.
    double u0 = 1e300, u1 = -1e300;
    for (int32_t c = 0; c < W; ++c) {
      const double centre = tc - fdc[static_cast<std::size_t>(c)] / ka[static_cast<std::size_t>(c)];
      u0 = std::min(u0, (centre - h - tb) * p);
      u1 = std::max(u1, (centre + h - tb) * p);
    }
    const auto m0 = static_cast<int64_t>(std::floor(u0)) - kMargin;
    const auto m1 = static_cast<int64_t>(std::ceil(u1)) + kMargin;
    const auto span = static_cast<int32_t>(m1 - m0 + 1);
    const int32_t len = dsp::genpow(span, 1);
    z.assign(static_cast<std::size_t>(len) * W, fcomplex{});
    const double t0 = m0 / p - (N - 1) / (2.0 * p);
    // Deramp: exp(j pi Ka t^2) along the span, by a phasor recurrence (its second difference
    // is constant), re-seeded every 256 rows against drift.
#pragma omp parallel for schedule(static)
    for (int32_t c = 0; c < W; ++c) {
      const double k = ka[static_cast<std::size_t>(c)];
      fcomplex* row = z.data() + static_cast<std::ptrdiff_t>(c) * len;
      const int32_t col = c0 + c;
      std::complex<double> w, r;
      const std::complex<double> q = std::polar(1.0, 2.0 * kPi * k / (p * p));
      for (int32_t m = 0; m < span; ++m) {
        if (m % 256 == 0) {
          const double t = t0 + m / p;
          w = std::polar(1.0, kPi * k * t * t);
          r = std::polar(1.0, kPi * k * (2.0 * t / p + 1.0 / (p * p)));
        }
        const int64_t g = m0 + m;
        const int64_t src = ((g % Nf) + Nf) % Nf;
        const std::complex<double> v = std::complex<double>(block[static_cast<std::size_t>(src) * M + col]) * w;
        row[m] = fcomplex(static_cast<float>(v.real()), static_cast<float>(v.imag()));
        w *= r;
        r *= q;
      }
    }
    dsp::fft_c(len, len, W, W, 1, 0, z);
    // The alias-rejection low-pass of each column's burst band.
#pragma omp parallel for schedule(static)
    for (int32_t c = 0; c < W; ++c) {
      const double B = std::abs(ka[static_cast<std::size_t>(c)]) * N / p;
      fcomplex* row = z.data() + static_cast<std::ptrdiff_t>(c) * len;
      for (int32_t qb = 0; qb < len; ++qb) {
        const double f = std::abs((qb <= len / 2 ? qb : qb - len) * p / len);
        double g = 0.0;
        if (f <= kPassBand * B) g = 1.0;
        else if (f < kStopBand * B) g = 0.5 * (1.0 + std::cos(kPi * (f - kPassBand * B) / ((kStopBand - kPassBand) * B)));
        row[qb] *= static_cast<float>(g);
      }
    }
    dsp::fft_c(len, len, W, W, -1, 0, z);
    // De-scalloping factors: the centroid and rate move slowly across range, so they are taken
    // at nodes every kScaleNode columns.
    const int32_t nodes = (W + kScaleNode - 1) / kScaleNode;
    const auto lines = static_cast<int32_t>(L1 - L0 + 1);
    scaleTable.assign(static_cast<std::size_t>(nodes) * lines, 1.0f);
    warpTable.assign(static_cast<std::size_t>(nodes) * lines, 0.0f);
    if (par.compensateAntenna) {
      // A gain that changes across a response moves its peak: by kappa sigma^2, kappa the
      // gain's logarithmic slope and sigma^2 = (PRF / (2 pi Ka))^2 / windowSpread the peak's
      // curvature. Each line is therefore read delta = kappa sigma^2 later, so that the peak
      // of every target stays at its time; the gain is taken at the time read.
#pragma omp parallel for schedule(static)
      for (int32_t n = 0; n < nodes; ++n) {
        const auto c = static_cast<std::size_t>(std::min(W - 1, n * kScaleNode + kScaleNode / 2));
        const double k = ka[c];
        const double sigma2 = p * p / (4.0 * kPi * kPi * k * k * windowSpread);
        // The log gain on the line grid and one line beyond each end; its slope by central
        // differences, its value at the time read by the slope.
        std::vector<double> lg(static_cast<std::size_t>(lines) + 2);
        for (int32_t l = -1; l <= lines; ++l) {
          const double d = (L0 + l) * a - tc;
          lg[static_cast<std::size_t>(l + 1)] = std::log(scallop.scale(-d * k, fdc[c], p));
        }
        for (int32_t l = 0; l < lines; ++l) {
          const auto q = static_cast<std::size_t>(l + 1);
          const double kappa = (lg[q + 1] - lg[q - 1]) / (2.0 * a);
          const double delta = kappa * sigma2;
          scaleTable[static_cast<std::size_t>(n) * lines + l] = static_cast<float>(std::exp(lg[q] + kappa * delta));
          warpTable[static_cast<std::size_t>(n) * lines + l] = static_cast<float>(delta);
        }
      }
    }
    // Resampling onto the output lines, reramp and de-scalloping.
#pragma omp parallel for schedule(static)
    for (int32_t c = 0; c < W; ++c) {
      const double k = ka[static_cast<std::size_t>(c)];
      const double centre = tc - fdc[static_cast<std::size_t>(c)] / k;
      const fcomplex* row = z.data() + static_cast<std::ptrdiff_t>(c) * len;
      const float* scale = scaleTable.data() + static_cast<std::size_t>(c / kScaleNode) * lines;
      const float* warp = warpTable.data() + static_cast<std::size_t>(c / kScaleNode) * lines;
      for (int32_t l = 0; l < lines; ++l) {
        const double T = (L0 + l) * a;
        if (std::abs(T - centre) > h) continue;
        const double Tr = T + warp[l];  // the time read
        const double u = (Tr - tb) * p - static_cast<double>(m0);
        const auto qi = static_cast<int64_t>(std::floor(u));
        if (qi < 0 || qi + 1 >= span) continue;
        const double frac = u - static_cast<double>(qi);
        const std::complex<double> v = (1.0 - frac) * std::complex<double>(row[qi]) + frac * std::complex<double>(row[qi + 1]);
        const double d = Tr - tc;
        const std::complex<double> o = v * std::polar(static_cast<double>(scale[l]), -kPi * k * d * d);
        image[static_cast<std::size_t>(l) * W + c] = fcomplex(static_cast<float>(o.real()), static_cast<float>(o.imag()));
      }
    }
    for (int64_t l = L0; l <= L1; ++l) {
      const double t = line_time(scan, par, l);
      encode_line_prefix(t, static_cast<int32_t>(l), line.data());
      std::memcpy(line.data() + 17, image.data() + static_cast<std::size_t>(l - L0) * W, 8 * static_cast<std::size_t>(W));
      par.statistics[i].add(std::span<const fcomplex>(image.data() + static_cast<std::size_t>(l - L0) * W, static_cast<std::size_t>(W)));
      out.write(line.data(), static_cast<int64_t>(line.size()));
      par.earliestTime[i] = std::min(par.earliestTime[i], t);
      par.latestTime[i] = std::max(par.latestTime[i], t);
    }
    par.firstLine[i] = std::min<int32_t>(par.firstLine[i], static_cast<int32_t>(L0));
    par.lastLine[i] = std::max<int32_t>(par.lastLine[i], static_cast<int32_t>(L1));
  }
  out.commit();
  return 0;
}

}  // namespace sar::scansar

// The ambiguous centroid polynomial: rating of the blocks, filling of the bad ones, the dominant
// plane of the phase field by a two-dimensional transform, the weighted fit of the residual,
// the ambiguity and the conversion to hertz.
#include <algorithm>
#include <cmath>
#include <cstdio>
#include <numbers>
#include <string>
#include <vector>

#include "base/diagnostics.hpp"
#include "doppler/dcest.hpp"
#include "dsp/fft.hpp"
#include "dsp/fitting.hpp"
#include "base/constants.hpp"

namespace sar::doppler {
namespace {

using base::kPi;
using base::kTwoPi;
constexpr double kSixteenPi2 = 157.91367041742973;

/// Trapezoidal refinement of the integral of g over [0, 1]: each round doubles the points,
/// until two rounds agree to 1e-6 relative; at most 20 rounds. False when it does not settle.
template <class G>
bool trapezoid(const G& g, double& result) {
  double s = 0.5 * (g(0.0) + g(1.0));
  double old = -1e60;
  int points = 1;
  for (int round = 1; round <= 20; ++round) {
    if (round > 1) {
      const double h = 1.0 / points;
      double sum = 0.0;
      for (int i = 0; i < points; ++i) sum += g((i + 0.5) * h);
      s = 0.5 * (s + sum * h);
      points *= 2;
    }
    if (std::fabs(s - old) < 1e-6 * std::fabs(old)) {
      result = s;
      return true;
    }
    old = s;
  }
  return false;
}

/// Size of the plane-search grid for precision p (cycles), at least covering n blocks.
int grid_size(double p, int n) {
  auto pow2above = [](double v) {
    const int e = v >= 1.0 ? static_cast<int>(std::trunc(std::log2(v))) + 1 : 1;
    return 1 << std::min(e, 24);
  };
  int size = p > 0.0 ? pow2above(std::floor(1.0 / p)) : 2;
  if (size < n) size = pow2above(static_cast<double>(n));
  return size;
}

}  // namespace

double dccycles(std::span<const double> c, double x, double y) {
  return c[0] + c[1] * x + c[2] * y + c[3] * x * y + c[4] * x * x + c[5] * x * x * x + c[6] * x * x * x * x;
}

int getkrstd(const dcimage& image, dcestconf& conf) {
  base::Frame frame("getkrstd");
  const double u = 2.0 * image.platformSpeed / (conf.AnLen * image.prf);
  const double b0 = bspline3(0.0);
  const double r1 = bspline3(u) / b0;
  const double r2 = bspline3(2.0 * u) / b0;
  for (auto& b : conf.blocks) {
    const double s = b.snr;
    auto g = [&](double x) {
      const double num = r1 * std::sin(kTwoPi * x) + 2.0 * r2 * std::sin(2.0 * kTwoPi * x);
      const double den = 1.0 / s + 1.0 + 2.0 * (r1 * std::cos(kTwoPi * x) + r2 * std::cos(2.0 * kTwoPi * x));
      const double q = num / den;
      return q * q;
    };
    double integral = 0.0;
    if (!(s > 0.0) || !trapezoid(g, integral) || !(integral > 0.0) || !std::isfinite(integral)) {
      std::printf("\nfunction getkrstd(): anomalous FAILURE (snr=%f) <==\n", s);
      return -1;
    }
    const double n = b.contrast > 0.0 ? static_cast<double>(conf.Blockl) * conf.Blocks / b.contrast : 1.0;
    b.phaseVariance = 1.0 / (integral * n * kSixteenPi2);
  }
  return 0;
}

int unwrapdcbin(dcestconf& conf, std::array<double, 3>& plane) {
  base::Frame frame("unwrapdcbin");
  const int nc = conf.blocksAcross;
  const int nr = conf.blockRows;
  const int pr = grid_size(conf.Fftrgprc, nc);
  const int pa = grid_size(conf.Fftazprc, nr);
  dsp::cvector grid(static_cast<std::size_t>(pr) * static_cast<std::size_t>(pa), dsp::fcomplex(0.0f, 0.0f));
  for (int r = 0; r < nr; ++r)
    for (int c = 0; c < nc; ++c) {
      const double f = conf.blocks[static_cast<std::size_t>(r) * nc + c].centroid;
      grid[static_cast<std::size_t>(r) * pr + c] =
          dsp::fcomplex(static_cast<float>(std::cos(kTwoPi * f)), static_cast<float>(std::sin(kTwoPi * f)));
    }
  if (int st = frame.check(dsp::fft_c(pr, pr, pa, pa, 1, 1, grid))) return st;
  std::size_t best = 0;
  float bestMag = -1.0f;
  for (std::size_t k = 0; k < grid.size(); ++k) {
    const float m = std::abs(grid[k]);
    if (m > bestMag) {
      bestMag = m;
      best = k;
    }
  }
  int ia = static_cast<int>(best / static_cast<std::size_t>(pr));
  int ir = static_cast<int>(best % static_cast<std::size_t>(pr));
  if (ia > pa / 2) ia -= pa;
  if (ir > pr / 2) ir -= pr;
  const double azSlope = static_cast<double>(ia) / pa / conf.Blockl;
  const double rgSlope = static_cast<double>(ir) / pr / conf.Blocks;
  const dcblock& first = conf.blocks.front();
  const double peakPhase = std::atan2(grid[best].imag(), grid[best].real()) / kTwoPi;
  plane = {rgSlope, azSlope, peakPhase - (first.sample * rgSlope + first.line * azSlope)};
  return 0;
}

int getdccoef(dcestconf& conf, const std::array<double, 3>& plane, std::span<double> coef) {
  base::Frame frame("getdccoef");
  std::vector<double> xs, ys, res, sig;
  for (const auto& b : conf.blocks) {
    if (!b.good) continue;
    const double pl = plane[2] + plane[0] * b.sample + plane[1] * b.line;
    // Phase of exp(j 2 pi f) exp(-j 2 pi plane) from sine and cosine products: no wrap.
    const double c = std::cos(kTwoPi * b.centroid) * std::cos(kTwoPi * pl) + std::sin(kTwoPi * b.centroid) * std::sin(kTwoPi * pl);
    const double s = std::sin(kTwoPi * b.centroid) * std::cos(kTwoPi * pl) - std::cos(kTwoPi * b.centroid) * std::sin(kTwoPi * pl);
    xs.push_back(b.sample);
    ys.push_back(b.line);
    res.push_back(std::atan2(s, c) / kTwoPi);
    sig.push_back(b.phaseVariance > 0.0 ? std::sqrt(b.phaseVariance) : 1.0);
  }
  if (xs.size() <= 7) {
    base::report(base::kReportError, "Too few good blocks for the Doppler centroid polynomial");
    return 10;
  }
  std::array<double, 7> a{};
  std::array<int, 7> mask{};
  // A narrow or short scene holds too few block columns or rows to fix every term: a power of
  // the range index needs more distinct columns than its degree, the azimuth term two rows.
  // Such terms are left out of the fit (and stay zero) instead of making it singular.
  std::vector<double> columns(xs), rows(ys);
  std::sort(columns.begin(), columns.end());
  std::sort(rows.begin(), rows.end());
  const auto nx = static_cast<int>(std::unique(columns.begin(), columns.end()) - columns.begin());
  const auto ny = static_cast<int>(std::unique(rows.begin(), rows.end()) - rows.begin());
  const std::array<bool, 7> determined = {true, nx > 1, ny > 1, nx > 1 && ny > 1, nx > 2, nx > 3, nx > 4};
  bool any = false;
  for (std::size_t j = 0; j < 7; ++j) {
    mask[j] = conf.Pol_Weights[j] != 0 && determined[j] ? 1 : 0;
    if (conf.Pol_Weights[j] != 0 && !determined[j])
      base::report(base::kReportWarning, "Doppler centroid term " + std::to_string(j) +
                                             " left out: too few block columns or rows to determine it");
    any = any || mask[j];
  }
  if (any) {
    std::vector<double> index(xs.size());
    for (std::size_t i = 0; i < index.size(); ++i) index[i] = static_cast<double>(i);
    dsp::RowMatrixXd covar;
    double chisq = 0.0;
    const dsp::IndexedBasisFunction basis = [&](int i, double, std::span<double> f) {
      const double x = xs[static_cast<std::size_t>(i)], y = ys[static_cast<std::size_t>(i)];
      f[0] = 1.0;
      f[1] = x;
      f[2] = y;
      f[3] = x * y;
      f[4] = x * x;
      f[5] = x * x * x;
      f[6] = x * x * x * x;
    };
    if (int st = frame.check(dsp::lfit_modOBX(index, res, sig, a, mask, covar, chisq, basis))) return st;
  }
  const std::array<double, 7> terms = {plane[2] + a[0], a[1] + plane[0], a[2] + plane[1], a[3], a[4], a[5], a[6]};
  for (std::size_t j = 0; j < 7; ++j) coef[j] = terms[j] * conf.Pol_Weights[j];
  return 0;
}

int ratesnr(dcestconf& conf) {
  double noise = 0.0;
  int valid = 0;
  for (const auto& b : conf.blocks)
    if (b.valid) {
      noise += b.noise;
      ++valid;
    }
  noise = valid > 0 ? noise / valid : 0.0;
  for (auto& b : conf.blocks) {
    b.filled = 0;
    if (noise <= 0.0) {
      // No noise can be told: every valid block is as good as any other.
      b.snr = b.valid ? 1e10 : 0.001;
    } else {
      b.snr = b.valid ? (b.power - noise) / noise : 0.001;
    }
    b.good = b.valid && b.snr > 0.0;
  }
  return 0;
}

int fillblocks(dcestconf& conf, const dcimage& image) {
  auto& blocks = conf.blocks;
  // Bad blocks take the mean of the good ones around them, in growing windows. Centroids are
  // averaged as phasors: 0.49 and -0.49 PRF lie 0.02 PRF apart and their mean is 0.5, not 0.
  const double limit = std::hypot(image.samples / 2.0, image.lines / 2.0);
  for (auto& b : blocks) {
    if (b.good) continue;
    double dx = conf.Blocks, dy = conf.Blockl;
    for (;;) {
      double sumC = 0.0, sumS = 0.0, sumSnr = 0.0;
      int n = 0;
      for (const auto& o : blocks) {
        if (&o == &b || !o.good || !o.valid) continue;
        if (std::abs(o.sample - b.sample) > dx || std::abs(o.line - b.line) > dy) continue;
        sumC += std::cos(kTwoPi * o.centroid);
        sumS += std::sin(kTwoPi * o.centroid);
        sumSnr += o.snr;
        ++n;
      }
      if (n > 0) {
        b.centroid = (sumC == 0.0 && sumS == 0.0) ? 0.0 : std::atan2(sumS, sumC) / kTwoPi;
        b.snr = sumSnr / n;
        b.filled = 1;
        break;
      }
      if (std::hypot(dx, dy) >= limit) {
        base::report(base::kReportError, "No valid Doppler block to fill the grid from");
        return -1;
      }
      dx += conf.Blocks;
      dy += conf.Blockl;
    }
  }
  // Blocks without statistics take the contrast of the nearest valid block (first on a tie).
  for (auto& b : blocks) {
    if (b.valid) continue;
    double bestD = 0.0;
    const dcblock* nearest = nullptr;
    for (const auto& o : blocks) {
      if (!o.valid) continue;
      const double d = std::hypot(static_cast<double>(o.sample - b.sample), static_cast<double>(o.line - b.line));
      if (!nearest || d < bestD) {
        nearest = &o;
        bestD = d;
      }
    }
    if (nearest) b.contrast = nearest->contrast;
  }
  return 0;
}

namespace {

// A block votes when the magnitude of its lag-one correlation stands this many times above the
// magnitude pure noise at the floor gives (that magnitude is Rayleigh distributed: a noise
// block passes with probability exp(-k^2), about 1e-4 for k = 3).
constexpr double kSignalFactor = 3.0;
// The weighted scatter of the block centroids about the fit may exceed what their phase
// variances predict by dcestconf::CentroidScatterBound (10 by default, in standard deviations)
// before the fit is refused. The variance model knows only the antenna, the SNR and the
// contrast: clutter of varying texture and bright scatterers scatter up to about 5 of them,
// while blocks that each see part of a point target's aperture scatter by a hundred and more.

double wrap_cycles(double v) { return v - std::round(v); }

using base::format_text;

/// A block whose centroid entered the fit and whose phase variance is known.
bool on_surface(const dcblock& b) { return b.good && !b.filled && b.phaseVariance > 0.0; }

/// The block's distance from the surface in its own predicted standard deviations.
double normalised_residual(const dcblock& b, std::span<const double> c) {
  return std::fabs(wrap_cycles(b.centroid - dccycles(c, b.sample, b.line))) / std::sqrt(b.phaseVariance);
}

/// The noise floor (median power per sample over the blocks: most blocks of a dark scene hold
/// noise alone, and over clutter the median errs high, which only makes the test stricter than
/// needed for blocks far brighter than noise) and the signal test of every block.
void mark_signal_blocks(dcestconf& conf) {
  std::vector<double> powers;
  for (const auto& b : conf.blocks)
    if (b.lagTerms > 0 && b.meanPower > 0.0 && std::isfinite(b.meanPower)) powers.push_back(b.meanPower);
  double floor = 0.0;
  if (!powers.empty()) {
    const auto mid = powers.begin() + static_cast<std::ptrdiff_t>(powers.size() / 2);
    std::nth_element(powers.begin(), mid, powers.end());
    floor = *mid;
  }
  conf.gates.noiseFloor = floor;
  conf.gates.signalBlocks = 0;
  for (auto& b : conf.blocks) {
    const double noiseOnly = std::sqrt(static_cast<double>(b.lagTerms)) * floor;
    b.signal = b.lagTerms > 0 && std::abs(b.lag1) > kSignalFactor * noiseOnly ? 1 : 0;
    if (!b.signal) b.good = 0;
    conf.gates.signalBlocks += b.signal;
  }
}

/// Range slope (Hz per second of two-way time) of the polynomial in cycles at (x, y).
double slope_hz(std::span<const double> c, double x, double y, double prf, double fs) {
  const double d = c[1] + c[3] * y + 2.0 * c[4] * x + 3.0 * c[5] * x * x + 4.0 * c[6] * x * x * x;
  return d * prf * fs;
}

/// The fitted surface's range slope must lie where the geometry can put it, across the whole
/// swath and at the top, middle and bottom of the scene. Returns why not ("" when it does).
std::string slope_gate(dcestconf& conf, const dcimage& image, std::span<const double> c) {
  auto& g = conf.gates;
  if (!(conf.slopeTolerance > 0.0)) return "";
  g.slopeLow = conf.geometricSlope - conf.slopeTolerance;
  g.slopeHigh = conf.geometricSlope + conf.slopeTolerance;
  const double rows[3] = {static_cast<double>(conf.blocks.front().line), image.lines / 2.0,
                          static_cast<double>(conf.blocks.back().line)};
  g.slopeWorst = conf.geometricSlope;
  for (const double y : rows)
    for (int k = 0; k <= 8; ++k) {
      const double x = (image.samples - 1) * k / 8.0;
      const double v = slope_hz(c, x, y, image.prf, conf.fs);
      if (std::fabs(v - conf.geometricSlope) > std::fabs(g.slopeWorst - conf.geometricSlope)) g.slopeWorst = v;
    }
  if (g.slopeWorst >= g.slopeLow && g.slopeWorst <= g.slopeHigh) return "";
  return format_text("fitted range slope %.4g Hz/s outside the geometric band %.4g .. %.4g Hz/s", g.slopeWorst,
                     g.slopeLow, g.slopeHigh);
}

/// The blocks that measured their centroid must lie about the surface as their phase variances
/// predict: sqrt(chi^2 / degrees of freedom) at most dcestconf::CentroidScatterBound. Returns
/// why not ("" when they do).
std::string scatter_gate(dcestconf& conf, std::span<const double> c) {
  auto& g = conf.gates;
  double chi2 = 0.0;
  int n = 0;
  for (const auto& b : conf.blocks)
    if (on_surface(b)) {
      const double z = normalised_residual(b, c);
      chi2 += z * z;
      ++n;
    }
  int terms = 0;
  for (std::size_t j = 0; j < 7; ++j) terms += c[j] != 0.0 ? 1 : 0;
  const int dof = std::max(1, n - terms);
  g.scatter = std::sqrt(chi2 / dof);
  g.scatterBound = conf.CentroidScatterBound;
  if (g.scatter <= g.scatterBound) return "";
  return format_text("weighted scatter of %d blocks about the fit %.3g times their predicted spread (bound %.3g)", n,
                     g.scatter, g.scatterBound);
}

/// One fractional centroid from the lag-one correlations of every signal block summed as
/// complex numbers: each block counts with its power, and the blocks that each hold part of a
/// point target's aperture add up to the whole aperture. False when the sum does not stand
/// clear of noise.
bool constant_centroid(dcestconf& conf) {
  auto& g = conf.gates;
  std::complex<double> sum{};
  double terms = 0.0;
  for (const auto& b : conf.blocks)
    if (b.signal) {
      sum += b.lag1;
      terms += static_cast<double>(b.lagTerms);
    }
  const double noiseOnly = std::sqrt(terms) * g.noiseFloor;
  g.constantCoherence = noiseOnly > 0.0 ? std::abs(sum) / noiseOnly : (std::abs(sum) > 0.0 ? HUGE_VAL : 0.0);
  g.constantCycles = std::abs(sum) > 0.0 ? std::arg(sum) / kTwoPi : 0.0;
  return terms > 0.0 && g.constantCoherence > kSignalFactor;
}

/// The surface of the blocks: fill, phase variances, plane, fit. False (with the reason in the
/// gates) when the blocks cannot carry a surface; a status of a failure that is no property
/// of the data (a file, a transform) is returned through `status`.
bool fitted_surface(const dcimage& image, dcestconf& conf, std::array<double, 7>& c, int& status) {
  auto& g = conf.gates;
  status = 0;
  const auto good = std::count_if(conf.blocks.begin(), conf.blocks.end(), [](const dcblock& b) { return b.good; });
  if (good <= 7) {
    g.failed = "signal blocks";
    g.reason = format_text("%d blocks with a signal, at least 8 needed for a surface", static_cast<int>(good));
    return false;
  }
  if (fillblocks(conf, image) != 0 || getkrstd(image, conf) != 0) {
    g.failed = "signal blocks";
    g.reason = "the block statistics do not carry a surface";
    return false;
  }
  if ((status = unwrapdcbin(conf, conf.plane)) != 0) return false;
  if (getdccoef(conf, conf.plane, c) != 0) {
    g.failed = "signal blocks";
    g.reason = "the surface fit failed";
    return false;
  }
  // Blocks that see part of a bright point target's aperture (or a patch moving on its own)
  // give centroids far off the surface of the rest: they are set aside and the surface fitted
  // again without them, twice at most. Off means beyond three robust standard deviations of the
  // normalised residuals, and never within three of the blocks' own predicted spread.
  const auto fitted = std::count_if(conf.blocks.begin(), conf.blocks.end(), on_surface);
  for (int pass = 0; pass < 2; ++pass) {
    std::vector<double> z;
    for (const auto& b : conf.blocks)
      if (on_surface(b)) z.push_back(normalised_residual(b, c));
    if (z.size() < 8) break;
    const auto mid = z.begin() + static_cast<std::ptrdiff_t>(z.size() / 2);
    std::nth_element(z.begin(), mid, z.end());
    const double limit = std::max(3.0, 3.0 * 1.4826 * *mid);
    int dropped = 0;
    for (auto& b : conf.blocks)
      if (on_surface(b) && normalised_residual(b, c) > limit) {
        b.good = 0;
        ++dropped;
      }
    if (dropped == 0) break;
    g.outliers += dropped;
    if (getdccoef(conf, conf.plane, c) != 0) {
      g.failed = "block scatter";
      g.reason = "too few blocks left on the surface once those off it are set aside";
      return false;
    }
  }
  if (3 * g.outliers > fitted) {
    g.failed = "block scatter";
    g.reason = format_text("%d of %d blocks lie off the fitted surface (at most a third may)", g.outliers,
                           static_cast<int>(fitted));
    return false;
  }
  return true;
}

}  // namespace

int dcnapoly(const dcimage& image, dcestconf& conf, DopplerPoly& poly) {
  base::Frame frame("dcnapoly");
  if (conf.blocks.empty()) return 10;
  conf.gates = CentroidGates{};
  ratesnr(conf);
  mark_signal_blocks(conf);
  auto& g = conf.gates;

  // The surface of the blocks, if it is plausible; else one constant from all signal blocks;
  // else the geometry. Each step down is reported with the gate that sent it there.
  std::array<double, 7> c{};
  int status = 0;
  g.source = CentroidSource::Fit;
  bool surface = fitted_surface(image, conf, c, status);
  if (surface) {
    // Both checks are made, so that the result file shows both values; the first to fail is named.
    const std::string slope = slope_gate(conf, image, c), scatter = scatter_gate(conf, c);
    if (!slope.empty() || !scatter.empty()) {
      surface = false;
      g.failed = slope.empty() ? "block scatter" : "range slope";
      g.reason = slope.empty() ? scatter : slope;
    }
  }
  if (status != 0) return frame.check(status);
  if (!surface) {
    c = {};
    if (constant_centroid(conf)) {
      g.source = CentroidSource::Constant;
      c[0] = g.constantCycles;
    } else {
      g.source = CentroidSource::Geometry;
      if (g.failed.empty() || g.signalBlocks == 0) {
        g.failed = "signal blocks";
        g.reason = format_text("%d blocks with a signal above the noise floor %.4g", g.signalBlocks,
                          g.noiseFloor);
      }
    }
    const std::string text = "Doppler centroid: " + g.failed + " check failed (" + g.reason + "): the " +
                             centroid_source_text(g.source) + " applied";
    base::report(base::kReportWarning, text);
    std::printf("\nWARNING: %s\n", text.c_str());
  }

  if (g.source == CentroidSource::Geometry) {
    conf.ambiguity = 0;
    conf.geometricAmbiguity = 0;
    conf.decision = AmbiguityDecision::GeometryFallback;
    c[0] = conf.geometricCentroid / image.prf;
  } else {
    // The ambiguity field always holds the value that is applied: an unresolved ambiguity
    // leaves the geometric fallback in it and is reported.
    const int st = estambiguity(conf, image, c);
    if (st == 1) {
      std::printf("\nWARNING: unresolved ambiguity!\n");
    } else if (st != 0) {
      return frame.check(st);
    }
    c[0] += conf.ambiguity;
  }

  // Cycles of the PRF over sample and line indices to hertz over seconds.
  const double prf = image.prf, fs = conf.fs;
  for (auto& v : c) v *= prf;
  c[1] *= fs;
  c[2] *= prf;
  c[3] *= prf * fs;
  c[4] *= fs * fs;
  c[5] *= fs * fs * fs;
  c[6] *= fs * fs * fs * fs;
  for (std::size_t i = 0; i < 7; ++i) poly[i] = c[i];
  poly[7] = image.rangeTimeOrigin;
  poly[8] = image.azimuthTimeOrigin;
  return 0;
}

}  // namespace sar::doppler

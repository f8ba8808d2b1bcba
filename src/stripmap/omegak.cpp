#include "stripmap/omegak.hpp"

#include <algorithm>
#include <array>
#include <cmath>
#include <cstdio>

#include "base/diagnostics.hpp"
#include "base/parallel.hpp"
#include "dsp/czt.hpp"
#include "dsp/fft.hpp"
#include "dsp/filters.hpp"
#include "dsp/vsincos.hpp"
#include "stripmap/stolt_lines.hpp"

namespace sar::stripmap {

namespace {

using dcomplex = std::complex<double>;

double sinc(double u) { return u == 0.0 ? 1.0 : std::sin(kPi * u) / (kPi * u); }

// Per-thread scratch of the per-sample loops: the phases and weights of one line are gathered
// first and turned into phasors by the vector sine and cosine in one call.
struct LineScratch {
  std::vector<double> phase, weight, s, c;
  void reserve(std::size_t n) {
    phase.resize(n);
    weight.resize(n);
    s.resize(n);
    c.resize(n);
  }
};

// Spectral weighting of a block: range and azimuth windows, antenna whitening, and the sums
// that normalise the image so that a window does not change the mean power of distributed
// scenes. The look angle is computed for every sample, window or not, so the antenna term
// always follows the sample it weights.
struct Weighting {
  double kr0 = 0.0, B = 0.0, A = 0.0, dky = 0.0, squint = 0.0, Lw = 0.0;
  double hr = 0.0, ha = 0.0, ar = 0.0, br = 0.0, aaz = 0.0, baz = 0.0;
  bool whiten = false;
  bool useRange = false;  // whether this kernel applies the range window
  double normBand = 0.0;  // |kr - kr0| below this enters the normalisation

  bool active() const { return ha != 0.0 || hr != 0.0 || whiten; }

  static double taper(double d, double a, double b, double h) {
    const double dd = d - a;
    if (dd <= 0.0) return 1.0;
    if (dd < b) return (1.0 - h) * std::cos(kPi * dd / b) + h;
    return 0.0;
  }
  double range_weight(double kr) const {
    return (useRange && hr != 0.0) ? taper(std::abs(kr - kr0), ar * B, br * B, hr) : 1.0;
  }
  // Everything of a sample's weight but the range window: the azimuth window and the antenna
  // whitening at the look angle of (kr, ky), and the antenna term G of the normalisation.
  void azimuth_terms(double kr, double ky, double& az, double& G) const {
    const double theta = squint - std::asin(std::clamp(ky / kr, -1.0, 1.0));
    az = 1.0;
    if (ha != 0.0) az *= taper(std::abs(theta), aaz * A, baz * A, ha);
    const double t2 = squint - std::asin(std::clamp((ky - dky) / kr, -1.0, 1.0));
    const double t3 = squint - std::asin(std::clamp((ky + dky) / kr, -1.0, 1.0));
    auto g4 = [&](double t) {
      const double s = sinc(Lw * std::sin(t));
      return s * s * s * s;
    };
    G = g4(t2) + g4(t3) + g4(theta);
    if (whiten) az *= 1.0 / (std::sqrt(G) + 0.0001);
  }
};

// The azimuth terms depend on kr only through ky/kr, which moves by a few parts in a thousand
// across the range band: per Doppler line they are evaluated at a few nodes over the line's kr
// span and interpolated, which spares the sample loops most of their transcendental calls.
class LineWeight {
 public:
  static constexpr int kNodes = 17;
  LineWeight(const Weighting& w, double ky, double kLow, double kHigh) : w_(w) {
    if (!w.active()) return;
    k0_ = kLow;
    step_ = (kHigh - kLow) / (kNodes - 1);
    for (int i = 0; i < kNodes; ++i)
      w.azimuth_terms(kLow + i * step_, ky, az_[static_cast<std::size_t>(i)], g_[static_cast<std::size_t>(i)]);
    // A line whose look angles straddle the window's cut has a step inside its span, which
    // interpolation would smear: such a line is weighted sample by sample.
    const bool anyCut = std::any_of(az_.begin(), az_.end(), [](double a) { return a == 0.0; });
    const bool anyPass = std::any_of(az_.begin(), az_.end(), [](double a) { return a != 0.0; });
    exact_ = anyCut && anyPass;
    ky_ = ky;
  }
  // Weight of one sample; adds to the normalisation sums when it lies in the chirp's band.
  /// Weights of bins kStart + (first + u) dk, u < count, without a range window: through the
  /// vector loops unless the line is weighted sample by sample.
  void weights(double kStart, int first, double dk, int count, double* out, double& s1, double& s2) const {
    if (!w_.active()) {
      std::fill(out, out + count, 1.0);
      return;
    }
    if (exact_) {
      for (int u = 0; u < count; ++u) out[u] = weight(kStart + (first + u) * dk, 1.0, s1, s2);
      return;
    }
    const detail::NodeWeights nodes{az_.data(), g_.data(), kNodes, k0_, step_, w_.kr0, w_.normBand};
    detail::line_kernels().node_weights(nodes, kStart, first, dk, count, out, s1, s2);
  }
  double weight(double kr, double rangeWeight, double& s1, double& s2) const {
    if (!w_.active()) return 1.0;
    double az = 0.0, G = 0.0;
    if (exact_) {
      w_.azimuth_terms(kr, ky_, az, G);
    } else {
      const double u = step_ > 0.0 ? std::clamp((kr - k0_) / step_, 0.0, kNodes - 1.0) : 0.0;
      const auto i = std::min(static_cast<std::size_t>(u), static_cast<std::size_t>(kNodes - 2));
      const double t = u - static_cast<double>(i);
      az = az_[i] + t * (az_[i + 1] - az_[i]);
      G = g_[i] + t * (g_[i + 1] - g_[i]);
    }
    const double wv = rangeWeight * az;
    if (std::abs(kr - w_.kr0) < w_.normBand) {
      s1 += G;
      s2 += wv * wv * G;
    }
    return wv;
  }

 private:
  const Weighting& w_;
  double k0_ = 0.0, step_ = 0.0, ky_ = 0.0;
  bool exact_ = false;
  std::array<double, kNodes> az_{}, g_{};
};
Weighting make_weighting(const wkparm& wk, bool useRange) {
  Weighting w;
  double kr0 = 0.0, ky0 = 0.0, kx0 = 0.0;
  WKCentre(wk, kr0, ky0, kx0);
  w.kr0 = kr0;
  w.B = 4.0 * kPi * wk.fs / kC;
  w.dky = 2.0 * kPi * wk.prf / wk.V;
  w.squint = block_squint(wk);
  w.Lw = wk.AntennaLength * wk.carrier / kC;
  w.whiten = wk.WhiteningFlag != 0;
  w.useRange = useRange;
  w.normBand = (wk.chirpBandwidth / wk.fs) * w.B / 2.0;
  const double kyc = 2.0 * kPi * wk.fd / wk.V;
  w.A = std::abs(std::asin(std::clamp((kyc + w.dky / 2) / (kr0 - w.B / 2), -1.0, 1.0)) -
                 std::asin(std::clamp((kyc - w.dky / 2) / (kr0 + w.B / 2), -1.0, 1.0)));
  w.ha = wk.azimuthWindowH;
  if (w.ha != 0.0) {
    if (wk.azimuthLookBandwidth > wk.prf) {
      std::printf("Wrong azimuth hamming window parameters: no window applied.\n");
      w.ha = 0.0;
    } else {
      w.aaz = (wk.azimuthLookBandwidth - wk.azimuthTransitionBandwidth) / 2 / wk.prf;
      w.baz = wk.azimuthTransitionBandwidth / 2 / wk.prf;
    }
  }
  w.hr = wk.rangeWindowH;
  if (w.hr != 0.0) {
    if (wk.fs < wk.rangeLookBandwidth) {
      std::printf("Wrong range hamming window parameters: no window applied. \n");
      w.hr = 0.0;
    } else {
      w.ar = (wk.rangeLookBandwidth - wk.rangeTransitionBandwidth) / 2 / wk.fs;
      w.br = wk.rangeTransitionBandwidth / 2 / wk.fs;
    }
  }
  return w;
}

// Normalisation factor from per-line sums, added in line order so that the result does not
// depend on how lines were shared between threads.
double normalisation(const Weighting& w, const std::vector<std::array<double, 2>>& sums) {
  if (!w.active()) return 1.0;
  double s1 = 0.0, s2 = 0.0;
  for (const auto& s : sums) {
    s1 += s[0];
    s2 += s[1];
  }
  return (s1 > 0.0 && s2 > 0.0) ? std::sqrt(s2 / s1) : 1.0;
}

// Back to azimuth time and the weighting's normalisation, in one pass.
void finish_block(wkparm& wk, const Weighting& w, const std::vector<std::array<double, 2>>& sums) {
  dsp::fft_plan back;
  const int pitch = wk.pitch > 0 ? wk.pitch : wk.samples;
  if (dsp::fft_makep_c(back, pitch, wk.samples, wk.lines, wk.lines, 0, -1, 1) != 0) return;
  dsp::pfft_c(back, wk.data, 1.0 / normalisation(w, sums));
}

// kx axis of the mapped grid: kx[i] = kxc - floor(M/2) dkx + i dkx.
struct KxAxis {
  double first = 0.0, step = 0.0;
  double at(int i) const { return first + i * step; }
  // Bins i1..i2 of the axis inside the kx span of one Doppler line, given the squares of its
  // ends (kr^2 - ky^2 at both ends of the kr band); false when the span is empty.
  bool span(double lowSquare, double highSquare, int M, int& i1, int& i2) const {
    if (!(lowSquare > 0.0 && highSquare > 0.0)) return false;
    i1 = std::max(0, static_cast<int>(std::ceil((std::sqrt(lowSquare) - first) / step)));
    i2 = std::min(M - 1, static_cast<int>(std::floor((std::sqrt(highSquare) - first) / step)) - 1);
    return i1 <= i2;
  }
};

// Back to range on the mapped grid; the first Nout samples replace the line, the rest is zero.
void finish_row(const dsp::fft_plan& back, dsp::cvector& out, fcomplex* row, int Nout, int n) {
  dsp::pfft_c(back, out);
  std::copy(out.begin(), out.begin() + Nout, row);
  std::fill(row + Nout, row + n, fcomplex{});
}

KxAxis kx_axis(double kx0, int M, double spacing) {
  KxAxis a;
  a.step = (2.0 * kPi / spacing) / M;
  a.first = kx0 - std::floor(M / 2.0) * a.step;
  return a;
}

}  // namespace

double block_squint(const wkparm& wk) {
  const double lambda = kC / wk.carrier;
  const double fd = wk.spectrumCentreFd != 0.0 ? wk.spectrumCentreFd : wk.fd;
  return std::asin(std::clamp(lambda * fd / (2.0 * wk.V), -1.0, 1.0));
}

int MyComputeEqPar(wkparm& wk) {
  const double Tr = wk.samples / wk.fs;
  const double lambda = kC / wk.carrier;
  auto fm = [&](double t) { return wk.rate[0] + wk.rate[1] * t + wk.rate[2] * t * t; };
  const double t1 = wk.nearTime - wk.rateReference;
  const double fm1 = fm(t1), fm2 = fm(t1 + Tr);
  const double p = lambda * wk.fd / 2.0;
  // The rate at either end is that of the beam centre there: with the hyperbolic range history
  // 1/fm = -lambda R / (2 (V^2 - p^2)), p = lambda fd / 2. A centroid that changes across the
  // block changes p from end to end; fitting V with the centre's p alone biases it, and at a
  // centroid of several PRFs a bias of 1e-5 in V moves the targets by a tenth of a line.
  const bool ends = wk.fdNear != 0.0 || wk.fdFar != 0.0;
  const double p1 = ends ? lambda * wk.fdNear / 2.0 : p, p2 = ends ? lambda * wk.fdFar / 2.0 : p;
  const double a1 = 1.0 / fm1, a2 = 1.0 / fm2;
  const double v2 = (a1 * p1 * p1 - a2 * p2 * p2 + kQuarterC * lambda * Tr) / (a1 - a2);
  if (!(fm1 != 0.0 && fm2 != 0.0 && fm1 != fm2 && v2 > std::max(p1 * p1, p2 * p2) && v2 > p * p && std::isfinite(v2))) {
    base::report(base::kReportError, "Doppler rate gives no equivalent velocity for the block");
    return 1;
  }
  wk.V = std::sqrt(v2);
  const double squint = std::asin(p / wk.V);
  // Slant range of the first sample's beam centre, then its closest approach at the block's squint.
  wk.R0 = -2.0 * a1 * (v2 - p1 * p1) / lambda * std::sqrt(1.0 - p1 * p1 / v2);
  if (wk.PerformInterpolation == 0) wk.R0 += (kC / (2.0 * wk.fs)) * (wk.samples / 2) * std::cos(squint);
  return 0;
}

void WKCentre(const wkparm& wk, double& kr0, double& ky0, double& kx0) {
  kr0 = 4.0 * kPi * wk.carrier / kC;
  const double fd = wk.spectrumCentreFd != 0.0 ? wk.spectrumCentreFd : wk.fd;
  ky0 = 2.0 * kPi * fd / wk.V;
  kx0 = std::sqrt(kr0 * kr0 - ky0 * ky0);
}

int OutImagePar(const wkparm& wk, int& M, double& spacing, double& Ni, int& Nout) {
  const double kr0 = 4.0 * kPi * wk.carrier / kC;
  const double B = 4.0 * kPi * wk.fs / kC;
  const double kmin = kr0 - B / 2, kmax = kr0 + B / 2;
  const double ky0 = 2.0 * kPi * wk.fd / wk.V;
  const double dky = 2.0 * kPi * wk.prf / wk.V;
  const double kyU = ky0 + dky / 2, kyL = ky0 - dky / 2;
  if (kyU > kmin) {
    std::printf("Squint angle too large: reached geometrical limit.\n");
    return 1;
  }
  const double Bkx = wk.fd > 0.0 ? std::sqrt(kmax * kmax - kyL * kyL) - std::sqrt(kmin * kmin - kyU * kyU)
                                 : std::sqrt(kmax * kmax - kyU * kyU) - std::sqrt(kmin * kmin - kyL * kyL);
  const double dr = kC / (2.0 * wk.fs);
  spacing = std::max(wk.rangePadding * dr, 2.0 * kPi / Bkx);
  const double squint = std::asin(std::clamp(kC / wk.carrier * wk.fd / (2.0 * wk.V), -1.0, 1.0));
  Nout = static_cast<int>(std::ceil(wk.samples * dr * std::cos(squint) / spacing));
  M = dsp::genpow(Nout, 1);
  if (wk.PerformInterpolation == 1) {
    Ni = std::trunc(M * (std::sqrt(kmax * kmax - ky0 * ky0) - std::sqrt(kmin * kmin - ky0 * ky0)) * spacing /
                    (2.0 * kPi));
  } else if (wk.PerformInterpolation > 1) {
    const int e = static_cast<int>(std::ceil(wk.samples * wk.StoltPadding / 2));
    Ni = dsp::genpow(wk.samples + 2 * e, 1);
  } else {
    Ni = 0.0;
  }
  return 0;
}

void KyAxis(const wkparm& wk, std::vector<double>& ky, std::vector<double>& ky2, std::vector<double>& rs) {
  double kr0 = 0.0, ky0 = 0.0, kx0 = 0.0;
  WKCentre(wk, kr0, ky0, kx0);
  const auto n = static_cast<std::size_t>(wk.lines);
  ky.resize(n);
  ky2.resize(n);
  rs.resize(n);
  const double prf = wk.prf, df = prf / wk.lines;
  const double b = wk.fd - std::floor(wk.fd / prf) * prf;
  for (std::size_t i = 0; i < n; ++i) {
    const double u = prf / 2 + static_cast<double>(i) * df - b;
    const double v = u - std::floor(u / prf) * prf - prf / 2 + wk.fd;
    ky[i] = 2.0 * kPi * v / wk.V;
    ky2[i] = ky[i] * ky[i];
    rs[i] = kr0 - std::sqrt(kx0 * kx0 + ky2[i]);
  }
}

void RngShift(const fcomplex* input, int n, double step, double k, fcomplex* output, int nOut, double x0,
              double norm) {
  const double inv = 1.0 / norm;
  constexpr int kSlice = 512;
  std::array<double, kSlice> phase{}, weight{};
  weight.fill(inv);
  for (int o = 0; o < n; o += kSlice) {
    const int m = std::min(kSlice, n - o);
    for (int i = 0; i < m; ++i) phase[static_cast<std::size_t>(i)] = k * ((o + i) * step + x0);
    if (input != output) std::copy(input + o, input + o + m, output + o);
    const std::span<fcomplex> part(output + o, static_cast<std::size_t>(m));
    const std::span<const double> ph(phase.data(), static_cast<std::size_t>(m));
    if (inv == 1.0)
      dsp::rotate_n(part, ph);
    else
      dsp::rotate_n(part, ph, std::span<const double>(weight.data(), static_cast<std::size_t>(m)));
  }
  for (int i = n; i < nOut; ++i) output[i] = fcomplex{};
}

int FastWK(wkparm& wk, std::span<const double> ky, std::span<const double> /*ky2*/, std::span<const double> rs,
           double sa, double sr) {
  const int n = wk.samples, L = wk.lines;
  const int pitch = wk.pitch > 0 ? wk.pitch : n;
  double kr0 = 0.0, ky0 = 0.0, kx0 = 0.0;
  WKCentre(wk, kr0, ky0, kx0);
  const double B = 4.0 * kPi * wk.fs / kC;
  const double dr = kC / (2.0 * wk.fs);
  const double squint = block_squint(wk);
  Weighting w = make_weighting(wk, true);

  dsp::fft_c(pitch, n, L, L, 1, 1, wk.data);
  std::vector<double> kr(static_cast<std::size_t>(n)), wr(static_cast<std::size_t>(n));
  for (int i = 0; i < n; ++i) {
    const double k = kr0 + (i - n / 2) * B / n;
    kr[static_cast<std::size_t>((i + n / 2) % n)] = k;
  }
  for (int i = 0; i < n; ++i) wr[static_cast<std::size_t>(i)] = w.range_weight(kr[static_cast<std::size_t>(i)]);
  const double x0 = -(n / 2) * dr * std::cos(squint);
  // Reference function, back to range and the line's migration ramp in one pass per line,
  // while the line is in cache.
  dsp::fft_plan back;
  if (dsp::fft_makep_c(back, n, n, 1, 1, -1, 0, 1) != 0) return 1;
  base::ParallelFailure failure;
#pragma omp parallel
  {
    LineScratch sc;
    failure.run([&] { sc.reserve(static_cast<std::size_t>(n)); });
#pragma omp for schedule(static)
    for (int j = 0; j < L; ++j) failure.run([&] {
      fcomplex* row = wk.data.data() + static_cast<std::ptrdiff_t>(j) * pitch;
      const double y = ky[static_cast<std::size_t>(j)];
      const LineWeight lw(w, y, kr0 - (n / 2) * B / n, kr0 + (n - 1 - n / 2) * B / n);
      double s1 = 0.0, s2 = 0.0;
      for (int i = 0; i < n; ++i) {
        const double k = kr[static_cast<std::size_t>(i)];
        sc.phase[static_cast<std::size_t>(i)] = (y - ky0) * sa + (std::sqrt(k * k - y * y) - kx0) * wk.R0 - (k - kr0) * sr;
        sc.weight[static_cast<std::size_t>(i)] = lw.weight(k, wr[static_cast<std::size_t>(i)], s1, s2);
      }
      const std::span<fcomplex> line(row, static_cast<std::size_t>(n));
      dsp::rotate_n(line, sc.phase, sc.weight);
      dsp::pfft_c(back, line);
      RngShift(row, n, dr, rs[static_cast<std::size_t>(j)], row, n, x0, 1.0);
    });
  }
  failure.rethrow();
  dsp::fft_c(pitch, n, L, L, 0, -1, wk.data);
  return 0;
}

int ChirpInterpWK(wkparm& wk, double Ni, int M, int Nout, std::span<const double> ky, std::span<const double> /*ky2*/,
                  std::span<const double> rs, double spacing, double sa, double sr) {
  const int n = wk.samples, L = wk.lines;
  const int pitch = wk.pitch > 0 ? wk.pitch : n;
  const int M2 = static_cast<int>(std::lround(Ni));
  if (M2 < 2 || M < 1 || Nout > n) {
    base::report(base::kReportError, "Stolt grid of the block cannot be built");
    return 1;
  }
  double kr0 = 0.0, ky0 = 0.0, kx0 = 0.0;
  WKCentre(wk, kr0, ky0, kx0);
  const double B = 4.0 * kPi * wk.fs / kC;
  const double dk = B / Ni;
  const double squint = block_squint(wk);
  const KxAxis kx = kx_axis(kx0, M, spacing);
  const Weighting w = make_weighting(wk, false);
  const double half = std::floor(M2 / 2.0);
  const double endOffset = (M2 - 1) * dk - half * dk;

  dsp::fft_c(pitch, n, L, L, 0, 1, wk.data);
  dsp::czt_plan plan;
  if (dsp::czt_makep_c(plan, n, M2) != 0) return 1;
  dsp::fft_plan back;
  if (dsp::fft_makep_c(back, M, M, 1, 1, -1, 0, 1) != 0) return 1;
  std::vector<std::array<double, 2>> sums(static_cast<std::size_t>(L), {0.0, 0.0});

  base::ParallelFailure failure;
#pragma omp parallel
  {
    dsp::cvector z, out;
    LineScratch sc;
    failure.run([&] {
      z.resize(static_cast<std::size_t>(M2) + 1);
      out.resize(static_cast<std::size_t>(M));
      sc.reserve(static_cast<std::size_t>(std::max(M2 + 1, M)));
    });
#pragma omp for schedule(dynamic, 16)
    for (int j = 0; j < L; ++j) failure.run([&] {
      fcomplex* row = wk.data.data() + static_cast<std::ptrdiff_t>(j) * pitch;
      const double y = ky[static_cast<std::size_t>(j)], r = rs[static_cast<std::size_t>(j)];
      const double e = r - std::trunc(r / dk) * dk;
      const double s = -half * dk - e;
      const double lowArg = (s + kr0) * (s + kr0) - y * y, highArg = (endOffset - e + kr0) * (endOffset - e + kr0) - y * y;
      int i1 = 0, i2 = 0;
      if (!kx.span(lowArg, highArg, M, i1, i2)) {
        std::fill(row, row + n, fcomplex{});
        return;
      }
      dsp::pczt_c(plan, std::span<const fcomplex>(row, static_cast<std::size_t>(n)),
                  std::span<fcomplex>(z.data(), static_cast<std::size_t>(M2)), -2.0 * kPi / Ni, s * (2.0 * kPi / B), 1);
      z[static_cast<std::size_t>(M2)] = fcomplex{};
      auto bin = [&](int i) { return (std::sqrt(kx.at(i) * kx.at(i) + y * y) - kr0 - s) / dk; };
      const int m1 = std::max(0, static_cast<int>(std::floor(bin(i1))));
      const int m2 = std::min(M2 - 1, static_cast<int>(std::floor(bin(i2))) + 1);
      double s1 = 0.0, s2 = 0.0;
      const LineWeight lw(w, y, kr0 + s + m1 * dk, kr0 + s + m2 * dk);
      const detail::LineKernels& kern = detail::line_kernels();
      if (m2 >= m1) {
        const int count = m2 - m1 + 1;
        const auto ucount = static_cast<std::size_t>(count);
        const detail::ReferencePhase ref{kr0 + s, dk, y * y, kx0, wk.R0, r - kr0, sr, m1};
        kern.reference_phase(ref, count, sc.phase.data());
        lw.weights(kr0 + s, m1, dk, count, sc.weight.data(), s1, s2);
        dsp::rotate_n(std::span<fcomplex>(z.data() + m1, ucount), std::span<const double>(sc.phase.data(), ucount),
                      std::span<const double>(sc.weight.data(), ucount));
      }
      sums[static_cast<std::size_t>(j)] = {s1, s2};
      const double lineTurn = (y - ky0) * sa + (wk.R0 / std::cos(squint)) * r;
      // Linear interpolation between the two chirp-Z bins, each turned back by its half-bin
      // phase: (1 - t) e^{j pi t} z_p + t e^{-j pi (1 - t)} z_{p+1}, and the line's own turn.
      // Since e^{-j pi (1 - t)} = -e^{j pi t}, one rotation serves all three. The bins and
      // phases of the line's span are gathered first for one call of the vector sine.
      const int span = i2 - i1 + 1;
      const auto uspan = static_cast<std::size_t>(span);
      const detail::OutputBins bins{kx.first, kx.step, y * y, kr0 + s, dk, lineTurn, i1};
      kern.output_bins(bins, span, sc.weight.data(), sc.phase.data());
      dsp::sincos_n(std::span<const double>(sc.phase.data(), uspan), sc.s, sc.c);
      // Output bin i goes to (i + M / 2) mod M: two runs, each contiguous.
      std::fill(out.begin(), out.end(), fcomplex{});
      const int wrap = M - M / 2;  // first bin that wraps round
      for (const auto& [from, to, dst] : {std::array<int, 3>{i1, std::min(i2, wrap - 1), i1 + M / 2},
                                          std::array<int, 3>{std::max(i1, wrap), i2, std::max(i1, wrap) + M / 2 - M}}) {
        if (to < from) continue;
        const auto u = static_cast<std::size_t>(from - i1);
        kern.two_point(z.data(), M2, sc.weight.data() + u, sc.s.data() + u, sc.c.data() + u, to - from + 1,
                       out.data() + dst);
      }
      finish_row(back, out, row, Nout, n);
    });
  }
  failure.rethrow();
  finish_block(wk, w, sums);
  return 0;
}

int LSInterpWK(wkparm& wk, double Ni, int M, int Nout, std::span<const double> ky, std::span<const double> /*ky2*/,
               double spacing, double sa, double sr) {
  const int n = wk.samples, L = wk.lines;
  const int pitch = wk.pitch > 0 ? wk.pitch : n;
  const int order = wk.PerformInterpolation;
  const int taps = 2 * order + 1;
  const int N = static_cast<int>(Ni);
  if (N < n || M < 1 || Nout > n) {
    base::report(base::kReportError, "Stolt grid of the block cannot be built");
    return 1;
  }
  std::vector<fcomplex> bank(static_cast<std::size_t>(101 * taps));
  if (dsp::MakeGLS(bank, taps, 101, 1.0 - wk.StoltPadding) != 0) {
    base::report(base::kReportError, "Stolt interpolator bank cannot be designed");
    return 1;
  }
  double kr0 = 0.0, ky0 = 0.0, kx0 = 0.0;
  WKCentre(wk, kr0, ky0, kx0);
  const double B = 4.0 * kPi * wk.fs / kC;
  const double dk = B / N;
  const double krs = kr0 - std::floor(N / 2.0) * dk;
  const double kre = krs + (N - 1) * dk;
  const double dr = kC / (2.0 * wk.fs);
  const double squint = block_squint(wk);
  const int P = wk.StoltPadding == 0.0 ? 0 : (N - n) / 2;
  const double q = std::cos(squint) * P * dr;
  const KxAxis kx = kx_axis(kx0, M, spacing);
  const Weighting w = make_weighting(wk, true);
  std::vector<double> wr(static_cast<std::size_t>(N));
  for (int m = 0; m < N; ++m) wr[static_cast<std::size_t>(m)] = w.range_weight(krs + m * dk);
  // The output turn exp(j (kx - kx0) q) depends on the kx bin only: one table for the block.
  std::vector<dcomplex> turn(static_cast<std::size_t>(M));
  {
    std::vector<double> ph(static_cast<std::size_t>(M)), ts(ph.size()), tc(ph.size());
    for (int i = 0; i < M; ++i) ph[static_cast<std::size_t>(i)] = (kx.at(i) - kx0) * q;
    dsp::sincos_n(ph, ts, tc);
    for (std::size_t i = 0; i < turn.size(); ++i) turn[i] = dcomplex(tc[i], ts[i]);
  }

  dsp::fft_c(pitch, n, L, L, 0, 1, wk.data);
  dsp::fft_plan fwd, back;
  if (dsp::fft_makep_c(fwd, N, N, 1, 1, 1, 0, 1) != 0 || dsp::fft_makep_c(back, M, M, 1, 1, -1, 0, 1) != 0) return 1;
  std::vector<std::array<double, 2>> sums(static_cast<std::size_t>(L), {0.0, 0.0});

  base::ParallelFailure failure;
#pragma omp parallel
  {
    dsp::cvector buf, out;
    LineScratch sc;
    failure.run([&] {
      buf.resize(static_cast<std::size_t>(N + 2 * order + 2));
      out.resize(static_cast<std::size_t>(M));
      sc.reserve(static_cast<std::size_t>(N));
    });
#pragma omp for schedule(dynamic, 16)
    for (int j = 0; j < L; ++j) failure.run([&] {
      fcomplex* row = wk.data.data() + static_cast<std::ptrdiff_t>(j) * pitch;
      const double y = ky[static_cast<std::size_t>(j)];
      const double lowArg = krs * krs - y * y, highArg = kre * kre - y * y;
      int i1 = 0, i2 = 0;
      if (!kx.span(lowArg, highArg, M, i1, i2)) {
        std::fill(row, row + n, fcomplex{});
        return;
      }
      std::fill(buf.begin(), buf.end(), fcomplex{});
      fcomplex* line = buf.data() + order;
      std::copy(row, row + n, line + P);
      dsp::pfft_c(fwd, std::span<fcomplex>(line, static_cast<std::size_t>(N)));
      dsp::fftshift(std::span<fcomplex>(line, static_cast<std::size_t>(N)), N, 1);
      double s1 = 0.0, s2 = 0.0;
      const LineWeight lw(w, y, krs, kre);
      for (int m = 0; m < N; ++m) {
        const double k = krs + m * dk;
        sc.phase[static_cast<std::size_t>(m)] =
            (std::sqrt(k * k - y * y) - kx0) * (wk.R0 - q) - (k - kr0) * (sr - P * dr) + (y - ky0) * sa;
        sc.weight[static_cast<std::size_t>(m)] = lw.weight(k, wr[static_cast<std::size_t>(m)], s1, s2);
      }
      dsp::rotate_n(std::span<fcomplex>(line, static_cast<std::size_t>(N)), sc.phase, sc.weight);
      sums[static_cast<std::size_t>(j)] = {s1, s2};
      std::fill(out.begin(), out.end(), fcomplex{});
      for (int i = i1; i <= i2; ++i) {
        const double x = std::abs(std::sqrt(kx.at(i) * kx.at(i) + y * y) - krs) / dk;
        const auto p = static_cast<int>(std::lround(x));
        const auto f = static_cast<int>(std::lround(100.0 * (x - p)));
        if (p < 0 || p >= N) continue;
        const fcomplex* h = bank.data() + static_cast<std::ptrdiff_t>(f + 50) * taps;
        // buf index p + t counts from the `order` leading zeros: sample p + t - order of the line.
        dcomplex acc;
        for (int t = 0; t < taps; ++t) acc += dcomplex(buf[static_cast<std::size_t>(p + t)]) * dcomplex(h[t]);
        acc *= turn[static_cast<std::size_t>(i)];
        out[static_cast<std::size_t>((i + M / 2) % M)] = fcomplex(static_cast<float>(acc.real()), static_cast<float>(acc.imag()));
      }
      finish_row(back, out, row, Nout, n);
    });
  }
  failure.rethrow();
  finish_block(wk, w, sums);
  return 0;
}

}  // namespace sar::stripmap

#include "analyser/irf.hpp"

#include <algorithm>
#include <cmath>
#include <functional>
#include <numbers>
#include <stdexcept>

#include "dsp/fft.hpp"

namespace sar::analyser {

namespace {

using dcomplex = std::complex<double>;
constexpr double kTwoPi = 2.0 * std::numbers::pi;

int round_half_away(double x) { return static_cast<int>(x >= 0.0 ? std::floor(x + 0.5) : std::ceil(x - 0.5)); }

int positive_mod(int a, int n) {
  const int r = a % n;
  return r < 0 ? r + n : r;
}

void forward_fft(dsp::cvector& data, int rows, int cols) {
  if (dsp::fft_c(cols, cols, rows, rows, 1, rows > 1 ? 1 : 0, std::span<dsp::fcomplex>(data)) != 0) {
    throw std::runtime_error("forward FFT refused");
  }
}

void backward_fft_unscaled(dsp::cvector& data, int rows, int cols) {
  if (dsp::fft_c(cols, cols, rows, rows, -2, rows > 1 ? -2 : 0, std::span<dsp::fcomplex>(data)) != 0) {
    throw std::runtime_error("backward FFT refused");
  }
}

// Circular mean frequency of a power spectrum over bins 0..n-1, in cycles a sample; 0 when the
// resultant is too weak (a flat spectrum, whose "centre" is noise).
double centroid_of(const std::vector<double>& power) {
  const int n = static_cast<int>(power.size());
  dcomplex acc = 0.0;
  double total = 0.0;
  for (int k = 0; k < n; ++k) {
    acc += power[static_cast<std::size_t>(k)] * std::polar(1.0, kTwoPi * k / n);
    total += power[static_cast<std::size_t>(k)];
  }
  if (!(total > 0.0) || std::abs(acc) < 0.05 * total) return 0.0;
  double f = std::arg(acc) / kTwoPi;
  if (f >= 0.5) f -= 1.0;
  return f;
}

// Where the bin of (demodulated) frequency k of an n-point spectrum goes in an m-point padded
// one. The folding bin of an even n is shared half and half by +n/2 and -n/2, so that the
// interpolant of a real sequence stays real.
struct PadSlot {
  int index[2];
  double weight[2];
  int count;
};

PadSlot pad_slot(int k, int n, int m) {
  if (n % 2 == 0 && k == n / 2) return {{n / 2, m - n / 2}, {0.5, 0.5}, 2};
  return {{positive_mod(k, m), 0}, {1.0, 0.0}, 1};
}

// Demodulated frequency of pad position j (0..n-1): -(n-1)/2 .. n/2.
int signed_bin(int j, int n) { return j <= n / 2 ? j : j - n; }

// Periodic interpolation kernel of an n-sample window whose band is centred on bin 0:
// (1/n) sum over the band of exp(j 2 pi k tau / n), the folding bin of an even n shared.
double dirichlet(int n, double tau) {
  const double s = std::sin(std::numbers::pi * tau / n);
  if (std::abs(s) < 1e-12) return 1.0;
  double d = 0.0;
  if (n % 2 == 0) {
    d = std::sin(std::numbers::pi * tau * (n - 1) / n) / s + std::cos(std::numbers::pi * tau);
  } else {
    d = std::sin(std::numbers::pi * tau) / s;
  }
  return d / n;
}

// Weights that give the band-limited interpolant of an n-sample window, band centred on bin
// `shift`, at local position t.
std::vector<dcomplex> interp_weights(int n, int shift, double t) {
  std::vector<dcomplex> w(static_cast<std::size_t>(n));
  for (int i = 0; i < n; ++i) {
    const double tau = t - i;
    w[static_cast<std::size_t>(i)] = dirichlet(n, tau) * std::polar(1.0, kTwoPi * shift * tau / n);
  }
  return w;
}

// The band-limited interpolant of a window of samples, its band centred on the spectral
// centroid.
class BandLimited {
 public:
  explicit BandLimited(std::span<const fcomplex> window) : n_(static_cast<int>(window.size())) {
    spectrum_.assign(window.begin(), window.end());
    forward_fft(spectrum_, 1, n_);
    std::vector<double> power(static_cast<std::size_t>(n_));
    for (int k = 0; k < n_; ++k) power[static_cast<std::size_t>(k)] = std::norm(spectrum_[static_cast<std::size_t>(k)]);
    centroid_ = centroid_of(power);
    shift_ = round_half_away(centroid_ * n_);
    ordered_.resize(static_cast<std::size_t>(n_));
    for (int j = 0; j < n_; ++j) {
      ordered_[static_cast<std::size_t>(j)] = spectrum_[static_cast<std::size_t>(positive_mod(j + shift_, n_))];
    }
  }

  double centroid() const { return centroid_; }
  int shift() const { return shift_; }

  /// The signal (modulation restored) at local position t.
  dcomplex value(double t) const {
    dcomplex sum = 0.0;
    const int low = -((n_ - 1) / 2);
    const int high = (n_ - 1) / 2;
    const dcomplex step = std::polar(1.0, kTwoPi * t / n_);
    dcomplex phasor = std::polar(1.0, kTwoPi * low * t / n_);
    for (int k = low; k <= high; ++k) {
      sum += dcomplex(ordered_[static_cast<std::size_t>(positive_mod(k, n_))]) * phasor;
      phasor *= step;
    }
    if (n_ % 2 == 0) sum += dcomplex(ordered_[static_cast<std::size_t>(n_ / 2)]) * std::cos(std::numbers::pi * t);
    return sum / static_cast<double>(n_) * std::polar(1.0, kTwoPi * shift_ * t / n_);
  }
  double power(double t) const { return std::norm(value(t)); }

  /// Power on the grid t = i / os, i = 0 .. n os - 1, by zero padding.
  std::vector<double> oversampled_power(int os) const {
    const int m = n_ * os;
    dsp::cvector padded(static_cast<std::size_t>(m), fcomplex(0.0f, 0.0f));
    for (int j = 0; j < n_; ++j) {
      const PadSlot slot = pad_slot(signed_bin(j, n_), n_, m);
      for (int s = 0; s < slot.count; ++s) {
        padded[static_cast<std::size_t>(slot.index[s])] +=
            ordered_[static_cast<std::size_t>(j)] * static_cast<float>(slot.weight[s]);
      }
    }
    backward_fft_unscaled(padded, 1, m);
    std::vector<double> p(static_cast<std::size_t>(m));
    const double scale = 1.0 / (static_cast<double>(n_) * n_);
    for (int i = 0; i < m; ++i) p[static_cast<std::size_t>(i)] = std::norm(dcomplex(padded[static_cast<std::size_t>(i)])) * scale;
    return p;
  }

 private:
  int n_;
  dsp::cvector spectrum_;
  std::vector<fcomplex> ordered_;  // spectrum by demodulated frequency, pad order
  double centroid_ = 0.0;
  int shift_ = 0;
};

// Extremum of f on [a, b] by golden section (f unimodal there).
double golden(const std::function<double(double)>& f, double a, double b, bool maximum) {
  const double g = (std::sqrt(5.0) - 1.0) / 2.0;
  const double sign = maximum ? 1.0 : -1.0;
  double c = b - g * (b - a);
  double d = a + g * (b - a);
  double fc = sign * f(c);
  double fd = sign * f(d);
  for (int i = 0; i < 80 && b - a > 1e-9; ++i) {
    if (fc > fd) {
      b = d;
      d = c;
      fd = fc;
      c = b - g * (b - a);
      fc = sign * f(c);
    } else {
      a = c;
      c = d;
      fc = fd;
      d = a + g * (b - a);
      fd = sign * f(d);
    }
  }
  return 0.5 * (a + b);
}

// Where f crosses `level` between a and b; grid values ga, gb stand in when the direct values
// do not bracket the level (a rounding difference between the grid and the interpolant).
double crossing(const std::function<double(double)>& f, double level, double a, double b, double ga, double gb) {
  double fa = f(a) - level;
  const double fb = f(b) - level;
  if (fa * fb > 0.0) return a + (b - a) * (ga - level) / (ga - gb);
  for (int i = 0; i < 60 && b - a > 1e-12; ++i) {
    const double c = 0.5 * (a + b);
    const double fc = f(c) - level;
    if (fa * fc <= 0.0) {
      b = c;
    } else {
      a = c;
      fa = fc;
    }
  }
  return 0.5 * (a + b);
}

// Integral of the piecewise linear interpolation of grid values p (grid step 1) from u0 to u1.
double integrate_grid(const std::vector<double>& p, double u0, double u1) {
  if (!(u1 > u0)) return 0.0;
  const int last = static_cast<int>(p.size()) - 1;
  auto at = [&](double u) {
    const int i = std::clamp(static_cast<int>(std::floor(u)), 0, last - 1);
    const double f = u - i;
    return p[static_cast<std::size_t>(i)] * (1.0 - f) + p[static_cast<std::size_t>(i + 1)] * f;
  };
  double sum = 0.0;
  double u = u0;
  while (u < u1) {
    const double next = std::min(u1, std::floor(u) + 1.0);
    sum += 0.5 * (next - u) * (at(u) + at(next));
    u = next;
  }
  return sum;
}

Irf1D failed(Irf1D r, std::string problem) {
  r.valid = false;
  r.problem = std::move(problem);
  return r;
}

// Measures the response in window [first, first + length) of the cut, its peak near sample
// `ipeak`. Positions come out in cut coordinates.
Irf1D analyse_window(std::span<const fcomplex> cut, int first, int length, int ipeak, const AnalyserOptions& o) {
  Irf1D r;
  r.window_first = first;
  r.window_length = length;
  const int os = o.oversample;
  r.oversample = os;
  const BandLimited bl(cut.subspan(static_cast<std::size_t>(first), static_cast<std::size_t>(length)));
  r.centroid = bl.centroid();
  const std::vector<double> p = bl.oversampled_power(os);
  const auto power = [&](double t) { return bl.power(t); };
  // Grid points past the last sample interpolate across the window's wrap: never used.
  const int last = (length - 1) * os;
  const auto grid = [&](int i) { return p[static_cast<std::size_t>(i)]; };
  const auto pos = [&](int i) { return static_cast<double>(i) / os; };

  const int centre = (ipeak - first) * os;
  int ip = std::max(0, centre - os);
  for (int i = ip; i <= std::min(last, centre + os); ++i) {
    if (grid(i) > grid(ip)) ip = i;
  }
  const double tp = golden(power, pos(std::max(0, ip - 1)), pos(std::min(last, ip + 1)), true);
  const double peak_power = power(tp);
  if (!(peak_power > 0.0)) return failed(r, "no signal at the peak");
  const dcomplex peak_value = bl.value(tp);
  r.peak = first + tp;
  r.amplitude = std::sqrt(peak_power);
  r.phase_rad = std::arg(peak_value);
  const double half = 0.5 * peak_power;

  // -3 dB points.
  int ia = ip;
  while (ia < last && grid(ia + 1) >= half) ++ia;
  int ib = ip;
  while (ib > 0 && grid(ib - 1) >= half) --ib;
  if (ia == last || ib == 0) return failed(r, "the response does not fall by 3 dB inside the window");
  const double after = crossing(power, half, pos(ia), pos(ia + 1), grid(ia), grid(ia + 1));
  const double before = crossing(power, half, pos(ib - 1), pos(ib), grid(ib - 1), grid(ib));
  r.half_power_after = first + after;
  r.half_power_before = first + before;
  r.resolution = after - before;

  // First nulls: the first minimum of the power on each side.
  int na = ia + 1;
  while (na < last && grid(na + 1) < grid(na)) ++na;
  int nb = ib - 1;
  while (nb > 0 && grid(nb - 1) < grid(nb)) --nb;
  if (na == last || nb == 0) return failed(r, "no null on both sides of the mainlobe inside the window");
  const double null_after = golden(power, pos(na - 1), pos(na + 1), false);
  const double null_before = golden(power, pos(nb - 1), pos(nb + 1), false);
  r.null_after = first + null_after;
  r.null_before = first + null_before;

  // Sidelobe region.
  const double span = o.islr_span * r.resolution;
  double region_first = tp - span;
  double region_last = tp + span;
  if (region_first < 0.0) {
    region_first = 0.0;
    r.span_truncated = true;
  }
  if (region_last > length - 1.0) {
    region_last = length - 1.0;
    r.span_truncated = true;
  }
  region_first = std::min(region_first, null_before);
  region_last = std::max(region_last, null_after);
  r.region_first = first + region_first;
  r.region_last = first + region_last;

  // Highest sidelobe.
  int is = -1;
  for (int i = static_cast<int>(std::ceil(region_first * os)); i <= last && pos(i) <= region_last; ++i) {
    if (pos(i) > null_before && pos(i) < null_after) continue;
    if (is < 0 || grid(i) > grid(is)) is = i;
  }
  if (is >= 0) {
    const bool outer = pos(is) < null_before;
    const double lo = outer ? std::max(region_first, pos(is) - 1.0 / os) : std::max(null_after, pos(is) - 1.0 / os);
    const double hi = outer ? std::min(null_before, pos(is) + 1.0 / os) : std::min(region_last, pos(is) + 1.0 / os);
    const double ts = golden(power, lo, hi, true);
    r.sidelobe_at = first + ts;
    r.pslr_db = 10.0 * std::log10(std::max(power(ts), grid(is)) / peak_power);
  }

  // Integrated sidelobes against the mainlobe.
  const double main = integrate_grid(p, null_before * os, null_after * os);
  const double side =
      integrate_grid(p, region_first * os, null_before * os) + integrate_grid(p, null_after * os, region_last * os);
  if (main > 0.0 && side > 0.0) r.islr_db = 10.0 * std::log10(side / main);

  if (o.keep_curves) {
    r.curve_first = first;
    r.curve_db.resize(static_cast<std::size_t>(last + 1));
    for (int i = 0; i <= last; ++i) {
      r.curve_db[static_cast<std::size_t>(i)] =
          static_cast<float>(10.0 * std::log10(std::max(grid(i) / peak_power, 1e-30)));
    }
  }
  r.valid = true;
  return r;
}

void shift_positions(Irf1D& r, double offset) {
  for (double* v : {&r.peak, &r.half_power_before, &r.half_power_after, &r.null_before, &r.null_after, &r.sidelobe_at,
                    &r.region_first, &r.region_last, &r.curve_first}) {
    *v += offset;
  }
  r.window_first += static_cast<int>(offset);
}

std::string check_options(const AnalyserOptions& o) {
  if (o.oversample < 2) return "oversampling factor below 2";
  if (o.search_radius < 0) return "negative search radius";
  if (o.neighbourhood < 8) return "neighbourhood below 8 samples";
  if (o.interp_window < 8) return "interpolation window below 8 samples";
  if (o.cut_length < 8) return "cut length below 8 samples";
  if (!(o.islr_span > 1.0)) return "ISLR span of one resolution or less";
  if (static_cast<std::int64_t>(std::max(o.max_cut_length, o.cut_length)) * o.oversample > (1 << 24)) {
    return "cut length times oversampling too large";
  }
  if (static_cast<std::int64_t>(o.neighbourhood) * o.oversample > 4096) return "neighbourhood times oversampling too large";
  return {};
}

// Cut along the samples of the image at fractional line `line` (view coordinates), samples
// [first, first + count): each column interpolated over `window` lines, band centred on the
// azimuth centroid.
std::vector<fcomplex> cut_along_samples(const ComplexImageView& v, double line, int first, int count, double centroid,
                                        int window) {
  const int n = std::min(window, v.lines);
  const int l0 = std::clamp(round_half_away(line) - n / 2, 0, v.lines - n);
  const std::vector<dcomplex> w = interp_weights(n, round_half_away(centroid * n), line - l0);
  std::vector<dcomplex> acc(static_cast<std::size_t>(count), 0.0);
  for (int i = 0; i < n; ++i) {
    const dcomplex wi = w[static_cast<std::size_t>(i)];
    for (int c = 0; c < count; ++c) acc[static_cast<std::size_t>(c)] += wi * dcomplex(v.at(l0 + i, first + c));
  }
  return {acc.begin(), acc.end()};
}

// Cut along the lines at fractional sample `sample`, lines [first, first + count).
std::vector<fcomplex> cut_along_lines(const ComplexImageView& v, double sample, int first, int count, double centroid,
                                      int window) {
  const int n = std::min(window, v.samples);
  const int s0 = std::clamp(round_half_away(sample) - n / 2, 0, v.samples - n);
  const std::vector<dcomplex> w = interp_weights(n, round_half_away(centroid * n), sample - s0);
  std::vector<fcomplex> out(static_cast<std::size_t>(count));
  for (int l = 0; l < count; ++l) {
    dcomplex sum = 0.0;
    for (int i = 0; i < n; ++i) sum += w[static_cast<std::size_t>(i)] * dcomplex(v.at(first + l, s0 + i));
    out[static_cast<std::size_t>(l)] = fcomplex(sum);
  }
  return out;
}

// Offset of the maximum of a parabola through three values, in steps, within +-0.5.
double parabolic_offset(double left, double centre, double right) {
  const double den = left - 2.0 * centre + right;
  if (!(den < 0.0)) return 0.0;
  return std::clamp(0.5 * (left - right) / den, -0.5, 0.5);
}

}  // namespace

bool ComplexImageView::consistent() const {
  if (lines < 0 || samples < 0 || stride < samples) return false;
  if (lines == 0 || samples == 0) return true;
  return static_cast<std::int64_t>(data.size()) >= (lines - 1) * stride + samples;
}

Irf1D measure_cut(std::span<const fcomplex> cut, double expected_index, const AnalyserOptions& o) {
  Irf1D r;
  if (std::string bad = check_options(o); !bad.empty()) return failed(r, bad);
  const int n = static_cast<int>(std::min<std::size_t>(cut.size(), 1u << 24));
  if (n < 8) return failed(r, "cut shorter than 8 samples");
  if (!std::isfinite(expected_index) || expected_index < -0.5 || expected_index > n - 0.5) {
    return failed(r, "expected position outside the cut");
  }
  const int centre = round_half_away(expected_index);
  int ipeak = -1;
  double best = 0.0;
  for (int i = std::max(0, centre - o.search_radius); i <= std::min(n - 1, centre + o.search_radius); ++i) {
    const double p = std::norm(dcomplex(cut[static_cast<std::size_t>(i)]));
    if (p > best) {
      best = p;
      ipeak = i;
    }
  }
  if (ipeak < 0 || !std::isfinite(best)) return failed(r, "no signal near the expected position");
  const auto power_at = [&](int i) { return std::norm(dcomplex(cut[static_cast<std::size_t>(i)])); };
  if ((ipeak == centre - o.search_radius && ipeak > 0 && power_at(ipeak - 1) > best) ||
      (ipeak == centre + o.search_radius && ipeak < n - 1 && power_at(ipeak + 1) > best)) {
    return failed(r, "the response rises beyond the search window");
  }

  int length = std::min(n, o.cut_length);
  const int longest = std::min(n, std::max(length, o.max_cut_length));
  while (true) {
    const int first = std::clamp(ipeak - length / 2, 0, n - length);
    r = analyse_window(cut, first, length, ipeak, o);
    if ((r.valid && !r.span_truncated) || length >= longest) break;
    const int wanted = r.valid ? 2 * static_cast<int>(std::ceil(o.islr_span * r.resolution)) + 8 : 2 * length;
    const int next = std::min(longest, dsp::genpow(std::min(wanted, 1 << 24), 1));
    if (next <= length) break;
    length = next;
  }
  return r;
}

Irf1D measure_cut(std::span<const fcomplex> cut, double expected_index, int oversample) {
  AnalyserOptions o;
  o.oversample = oversample;
  return measure_cut(cut, expected_index, o);
}

IrfMeasure measure_point(const ComplexImageView& v, double expected_line, double expected_sample,
                         const AnalyserOptions& o) {
  IrfMeasure m;
  m.expected_line = expected_line;
  m.expected_sample = expected_sample;
  auto fail = [&](std::string why) {
    m.valid = false;
    m.problem = std::move(why);
    return m;
  };
  if (std::string bad = check_options(o); !bad.empty()) return fail(bad);
  if (!v.consistent()) return fail("image window inconsistent with its data");
  if (v.lines < 8 || v.samples < 8) return fail("image smaller than 8 x 8 samples");
  const double el = expected_line - v.first_line;
  const double es = expected_sample - v.first_sample;
  if (!std::isfinite(el) || !std::isfinite(es) || el < -0.5 || el > v.lines - 0.5 || es < -0.5 ||
      es > v.samples - 0.5) {
    return fail("expected position outside the image");
  }

  // Brightest sample of the search window.
  const int cl = round_half_away(el);
  const int cs = round_half_away(es);
  int il = -1;
  int is = -1;
  double best = 0.0;
  for (int l = std::max(0, cl - o.search_radius); l <= std::min(v.lines - 1, cl + o.search_radius); ++l) {
    for (int s = std::max(0, cs - o.search_radius); s <= std::min(v.samples - 1, cs + o.search_radius); ++s) {
      const double p = std::norm(dcomplex(v.at(l, s)));
      if (p > best) {
        best = p;
        il = l;
        is = s;
      }
    }
  }
  if (il < 0 || !std::isfinite(best)) return fail("no signal near the expected position");
  {
    // A brighter sample just beyond the window's border: the response lies outside it.
    const auto brighter = [&](int l, int s) {
      return l >= 0 && l < v.lines && s >= 0 && s < v.samples && std::norm(dcomplex(v.at(l, s))) > best;
    };
    const bool edge_l = std::abs(il - cl) == o.search_radius;
    const bool edge_s = std::abs(is - cs) == o.search_radius;
    if ((edge_l && brighter(il + (il > cl ? 1 : -1), is)) || (edge_s && brighter(il, is + (is > cs ? 1 : -1)))) {
      return fail("the response rises beyond the search window");
    }
  }

  // Oversampled neighbourhood: centroids per dimension, zero padding opposite them.
  const int os = o.oversample;
  const int na = std::min(o.neighbourhood, v.lines);
  const int nr = std::min(o.neighbourhood, v.samples);
  const int fa = std::clamp(il - na / 2, 0, v.lines - na);
  const int fr = std::clamp(is - nr / 2, 0, v.samples - nr);
  dsp::cvector spectrum(static_cast<std::size_t>(na) * static_cast<std::size_t>(nr));
  for (int l = 0; l < na; ++l) {
    for (int s = 0; s < nr; ++s) spectrum[static_cast<std::size_t>(l * nr + s)] = v.at(fa + l, fr + s);
  }
  forward_fft(spectrum, na, nr);
  std::vector<double> pa(static_cast<std::size_t>(na), 0.0);
  std::vector<double> pr(static_cast<std::size_t>(nr), 0.0);
  for (int l = 0; l < na; ++l) {
    for (int s = 0; s < nr; ++s) {
      const double p = std::norm(dcomplex(spectrum[static_cast<std::size_t>(l * nr + s)]));
      pa[static_cast<std::size_t>(l)] += p;
      pr[static_cast<std::size_t>(s)] += p;
    }
  }
  m.centroid_az = centroid_of(pa);
  m.centroid_rg = centroid_of(pr);
  const int shift_a = round_half_away(m.centroid_az * na);
  const int shift_r = round_half_away(m.centroid_rg * nr);
  const int ma = na * os;
  const int mr = nr * os;
  dsp::cvector big(static_cast<std::size_t>(ma) * static_cast<std::size_t>(mr), fcomplex(0.0f, 0.0f));
  for (int ja = 0; ja < na; ++ja) {
    const PadSlot sa = pad_slot(signed_bin(ja, na), na, ma);
    const int from_a = positive_mod(ja + shift_a, na);
    for (int jr = 0; jr < nr; ++jr) {
      const PadSlot sr = pad_slot(signed_bin(jr, nr), nr, mr);
      const fcomplex value = spectrum[static_cast<std::size_t>(from_a * nr + positive_mod(jr + shift_r, nr))];
      for (int a = 0; a < sa.count; ++a) {
        for (int r = 0; r < sr.count; ++r) {
          big[static_cast<std::size_t>(sa.index[a]) * static_cast<std::size_t>(mr) + static_cast<std::size_t>(sr.index[r])] +=
              value * static_cast<float>(sa.weight[a] * sr.weight[r]);
        }
      }
    }
  }
  backward_fft_unscaled(big, ma, mr);
  const double scale = 1.0 / (static_cast<double>(na) * nr * na * nr);
  const auto grid = [&](int a, int r) {
    return std::norm(dcomplex(big[static_cast<std::size_t>(a) * static_cast<std::size_t>(mr) + static_cast<std::size_t>(r)])) *
           scale;
  };
  // Grid points past the last line or sample interpolate across the wrap: never used.
  const int last_a = (na - 1) * os;
  const int last_r = (nr - 1) * os;
  const int ca = (il - fa) * os;
  const int cr = (is - fr) * os;
  int ga = ca;
  int gr = cr;
  for (int a = std::max(0, ca - os); a <= std::min(last_a, ca + os); ++a) {
    for (int r = std::max(0, cr - os); r <= std::min(last_r, cr + os); ++r) {
      if (grid(a, r) > grid(ga, gr)) {
        ga = a;
        gr = r;
      }
    }
  }
  double da = 0.0;
  double dr = 0.0;
  if (ga > 0 && ga < last_a) da = parabolic_offset(grid(ga - 1, gr), grid(ga, gr), grid(ga + 1, gr));
  if (gr > 0 && gr < last_r) dr = parabolic_offset(grid(ga, gr - 1), grid(ga, gr), grid(ga, gr + 1));
  double line = fa + (ga + da) / os;
  double sample = fr + (gr + dr) / os;

  if (o.keep_curves) {
    // The patch shown: +-8 samples about the peak.
    const int reach = 8 * os;
    const int a0 = std::max(0, ga - reach);
    const int a1 = std::min(last_a, ga + reach);
    const int r0 = std::max(0, gr - reach);
    const int r1 = std::min(last_r, gr + reach);
    const double peak = grid(ga, gr);
    m.patch_lines = a1 - a0 + 1;
    m.patch_samples = r1 - r0 + 1;
    m.patch_first_line = v.first_line + fa + static_cast<double>(a0) / os;
    m.patch_first_sample = v.first_sample + fr + static_cast<double>(r0) / os;
    m.patch_db.reserve(static_cast<std::size_t>(m.patch_lines) * static_cast<std::size_t>(m.patch_samples));
    for (int a = a0; a <= a1; ++a) {
      for (int r = r0; r <= r1; ++r) {
        m.patch_db.push_back(static_cast<float>(10.0 * std::log10(std::max(grid(a, r) / peak, 1e-30))));
      }
    }
  }

  // Cuts through the peak, taken again at each new estimate.
  AnalyserOptions local = o;
  local.search_radius = 2;
  const int count_r = std::min(v.samples, std::max(o.cut_length, o.max_cut_length));
  const int count_a = std::min(v.lines, std::max(o.cut_length, o.max_cut_length));
  Irf1D az;
  Irf1D rg;
  int first_r = 0;
  int first_a = 0;
  for (int iteration = 0; iteration < 12; ++iteration) {
    first_r = std::clamp(round_half_away(sample) - count_r / 2, 0, v.samples - count_r);
    rg = measure_cut(cut_along_samples(v, line, first_r, count_r, m.centroid_az, o.interp_window), sample - first_r, local);
    if (!rg.valid) break;
    const double new_sample = rg.peak + first_r;
    first_a = std::clamp(round_half_away(line) - count_a / 2, 0, v.lines - count_a);
    az = measure_cut(cut_along_lines(v, new_sample, first_a, count_a, m.centroid_rg, o.interp_window), line - first_a,
                     local);
    if (!az.valid) break;
    const double new_line = az.peak + first_a;
    const bool settled = std::abs(new_line - line) < 1e-4 && std::abs(new_sample - sample) < 1e-4;
    line = new_line;
    sample = new_sample;
    if (settled) break;
  }
  if (!rg.valid) return fail("range cut: " + rg.problem);
  if (!az.valid) return fail("azimuth cut: " + az.problem);
  shift_positions(rg, first_r + v.first_sample);
  shift_positions(az, first_a + v.first_line);

  m.valid = true;
  m.peak_line = line + v.first_line;
  m.peak_sample = sample + v.first_sample;
  m.res_az_px = az.resolution;
  m.res_rg_px = rg.resolution;
  m.pslr_az_db = az.pslr_db;
  m.pslr_rg_db = rg.pslr_db;
  m.islr_az_db = az.islr_db;
  m.islr_rg_db = rg.islr_db;
  m.amplitude = rg.amplitude;
  m.phase_rad = rg.phase_rad;
  m.azimuth = std::move(az);
  m.range = std::move(rg);
  return m;
}

}  // namespace sar::analyser

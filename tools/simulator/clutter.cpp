#include "simulator/clutter.hpp"

#include <algorithm>
#include <cmath>
#include <limits>
#include <stdexcept>
#include <utility>

#include "dsp/fft.hpp"

namespace sar::simulator {

namespace {

using fcomplex = std::complex<float>;
using dcomplex = std::complex<double>;

constexpr double kTwoPi = 2.0 * kPi;
constexpr int kRangeGuard = 16;    // samples kept free beside a block's echoes
constexpr int kAzimuthGuard = 32;  // lines beyond the pattern's main lobe
constexpr int kChunkRows = 32;     // azimuth bins transformed in range together
constexpr double kCentroidStep = 5.0;  // Hz of centroid change allowed over a range block
constexpr int kMinRangeBlock = 128;
constexpr std::size_t kCellStep = 16;  // cells between exact evaluations of the azimuth phase
constexpr std::size_t kRangeStep = 8;  // range bins between exact evaluations of the transfer

// Plans made while it lives are made at once (FFTW's estimate): no timing of candidates, and
// the same plan, hence the same samples, in every run.
class EstimatePlanning {
 public:
  EstimatePlanning() : previous_(dsp::fft_planning()) { dsp::set_fft_planning(dsp::FftPlanning::Estimate); }
  ~EstimatePlanning() { dsp::set_fft_planning(previous_); }
  EstimatePlanning(const EstimatePlanning&) = delete;
  EstimatePlanning& operator=(const EstimatePlanning&) = delete;

 private:
  dsp::FftPlanning previous_;
};

double sinc(double x) { return std::abs(x) < 1e-12 ? 1.0 : std::sin(kPi * x) / (kPi * x); }

double frac(double x) { return x - std::floor(x); }

// x - k PRF in [-PRF/2, PRF/2).
double wrap(double x, double prf) { return x - prf * std::floor(x / prf + 0.5); }

// Mixing function of splitmix64: a counter-based generator, so that any cell's value is known
// without running a sequence.
uint64_t mix(uint64_t z) {
  z += 0x9E3779B97F4A7C15ull;
  z = (z ^ (z >> 30)) * 0xBF58476D1CE4E5B9ull;
  z = (z ^ (z >> 27)) * 0x94D049BB133111EBull;
  return z ^ (z >> 31);
}

uint64_t row_key(uint64_t seed, uint64_t stream, long long row) {
  return mix(mix(seed + stream * 0x632BE59BD9B4E019ull) ^ static_cast<uint64_t>(row));
}

uint64_t cell_key(uint64_t row, long long col) { return mix(row ^ (static_cast<uint64_t>(col) * 0xD6E8FEB86659FD93ull)); }

double unit_open(uint64_t bits32) { return (static_cast<double>(bits32) + 0.5) * (1.0 / 4294967296.0); }

// Circular complex Gaussian of unit power from 64 random bits.
fcomplex complex_normal(uint64_t h) {
  const double r = std::sqrt(-std::log(unit_open(h >> 32)));
  const double a = kTwoPi * unit_open(h & 0xFFFFFFFFull);
  return {static_cast<float>(r * std::cos(a)), static_cast<float>(r * std::sin(a))};
}

double real_normal(uint64_t h) {
  return std::sqrt(-2.0 * std::log(unit_open(h >> 32))) * std::cos(kTwoPi * unit_open(h & 0xFFFFFFFFull));
}

// Azimuth time, from zero Doppler, at which the Doppler at the carrier is f on the hyperbola
// of closest range r0 and effective velocity vr. NaN past the horizon of the model.
double time_of_doppler(double f, double r0, double vr, double lambda) {
  const double s = vr * vr - 0.25 * lambda * lambda * f * f;
  if (s <= 0.0) return std::nan("");
  return -lambda * r0 * f / (2.0 * vr * std::sqrt(s));
}

// High-contrast scene parameters.
constexpr double kTextureSigma = 1.0;    // of the log of the texture
constexpr int kTextureLines = 64;        // lattice of the texture field
constexpr int kTextureSamples = 16;
constexpr double kBrightShare = 1.0 / 5000.0;
constexpr double kBrightPower = 1000.0;  // +30 dB
constexpr double kWaterPower = 0.0316227766016838;  // -15 dB

class RandomScene {
 public:
  // The edge meanders around the middle of the cells that echo into a window of `samples`
  // after a pulse of `pulse` samples, so that land and water share the raw samples evenly.
  RandomScene(uint64_t seed, double sigma, ClutterContrast contrast, int samples, int pulse)
      : seed_(seed), sigma_(sigma), contrast_(contrast), samples_(samples), centre_(0.5 * (samples - pulse)) {
    const double land = 1.0 + kBrightShare * (kBrightPower - 1.0);
    norm_ = 1.0 / std::sqrt(0.5 * land + 0.5 * kWaterPower);
  }

  void operator()(long long row, long long first_col, std::span<fcomplex> out) const {
    const uint64_t speckle = row_key(seed_, 1, row);
    if (contrast_ == ClutterContrast::kLow) {
      const float s = static_cast<float>(sigma_);
      for (std::size_t i = 0; i < out.size(); ++i)
        out[i] = s * complex_normal(cell_key(speckle, first_col + static_cast<long long>(i)));
      return;
    }
    // Land up to a meandering edge, water beyond it.
    const double m = static_cast<double>(row);
    const double edge = centre_ + samples_ / 8.0 * std::sin(kTwoPi * m / 4000.0) +
                        samples_ / 16.0 * std::sin(kTwoPi * m / 1500.0 + 1.0);
    // Texture: a unit Gaussian field interpolated over a lattice, exponentiated.
    const long long li = floor_div(row, kTextureLines);
    const double fm = smooth(static_cast<double>(row - li * kTextureLines) / kTextureLines);
    const uint64_t lat0 = row_key(seed_, 2, li), lat1 = row_key(seed_, 2, li + 1);
    const uint64_t bright = row_key(seed_, 3, row);
    long long lattice_col = std::numeric_limits<long long>::min();
    double z00 = 0, z01 = 0, z10 = 0, z11 = 0;
    for (std::size_t i = 0; i < out.size(); ++i) {
      const long long n = first_col + static_cast<long long>(i);
      const fcomplex speck = complex_normal(cell_key(speckle, n));
      if (static_cast<double>(n) > edge) {
        out[i] = static_cast<float>(sigma_ * norm_ * std::sqrt(kWaterPower)) * speck;
        continue;
      }
      const uint64_t b = cell_key(bright, n);
      if (unit_open(b >> 32) < kBrightShare) {
        out[i] = std::polar(static_cast<float>(sigma_ * norm_ * std::sqrt(kBrightPower)),
                            static_cast<float>(kTwoPi * unit_open(b & 0xFFFFFFFFull)));
        continue;
      }
      const long long lj = floor_div(n, kTextureSamples);
      if (lj != lattice_col) {
        lattice_col = lj;
        z00 = real_normal(cell_key(lat0, lj));
        z01 = real_normal(cell_key(lat0, lj + 1));
        z10 = real_normal(cell_key(lat1, lj));
        z11 = real_normal(cell_key(lat1, lj + 1));
      }
      const double fn = smooth(static_cast<double>(n - lj * kTextureSamples) / kTextureSamples);
      const double w00 = (1 - fm) * (1 - fn), w01 = (1 - fm) * fn, w10 = fm * (1 - fn), w11 = fm * fn;
      const double g = (w00 * z00 + w01 * z01 + w10 * z10 + w11 * z11) /
                       std::sqrt(w00 * w00 + w01 * w01 + w10 * w10 + w11 * w11);
      const double texture = std::exp(kTextureSigma * g - 0.5 * kTextureSigma * kTextureSigma);
      out[i] = static_cast<float>(sigma_ * norm_ * std::sqrt(texture)) * speck;
    }
  }

 private:
  static long long floor_div(long long a, long long b) { return a >= 0 ? a / b : -((-a + b - 1) / b); }
  static double smooth(double f) { return f * f * (3.0 - 2.0 * f); }

  uint64_t seed_;
  double sigma_;
  ClutterContrast contrast_;
  int samples_;
  double centre_;
  double norm_ = 1.0;
};

void check_geometry(const ClutterGeometry& g) {
  auto positive = [](double v) { return std::isfinite(v) && v > 0.0; };
  if (g.lines < 1 || g.samples < 1) throw std::invalid_argument("clutter: no lines or samples");
  if (!positive(g.prf) || !positive(g.sampling_frequency) || !positive(g.carrier_frequency) ||
      !positive(g.pulse_length) || !positive(g.antenna_length) || !positive(g.satellite_speed) ||
      !positive(g.near_range_time) || !(g.chirp_bandwidth >= 0.0))
    throw std::invalid_argument("clutter: acquisition parameters must be positive");
  if (!g.effective_velocity || !g.doppler_centroid)
    throw std::invalid_argument("clutter: effective velocity and Doppler centroid are needed");
  if (!(g.pattern_extent > 0.0 && g.pattern_extent <= 3.0))
    throw std::invalid_argument("clutter: pattern extent must lie in (0, 3]");
  if (g.range_block < kMinRangeBlock) throw std::invalid_argument("clutter: range blocks of at least 128 cells");
  if (g.max_fft_lines < 256) throw std::invalid_argument("clutter: azimuth transforms of at least 256 lines");
}

}  // namespace

const char* clutter_contrast_name(ClutterContrast contrast) {
  return contrast == ClutterContrast::kHigh ? "high" : "low";
}

ClutterContrast clutter_contrast_from_name(const std::string& name) {
  if (name == "low") return ClutterContrast::kLow;
  if (name == "high") return ClutterContrast::kHigh;
  throw std::invalid_argument("unknown clutter contrast: " + name);
}

void set_orbit_geometry(ClutterGeometry& g, const OrbitModel& orbit, double time_offset, double height) {
  g.satellite_speed = orbit.state_at_offset(time_offset).velocity.norm();
  const double fs = g.sampling_frequency, lambda = kSpeedOfLight / g.carrier_frequency;
  // Vr = sqrt(R0 R'') of the ground point seen at zero Doppler at time offset t and slant range r0.
  const double half = g.pattern_extent * 2.0 * g.satellite_speed / g.antenna_length;
  auto effective_velocity = [&](double t, double r0, double fdc) {
    const StateVector s = orbit.state_at_offset(t);
    const Vec3 along = s.velocity.unit();
    const Vec3 up = (s.position - along * s.position.dot(along)).unit();
    const Vec3 right = along.cross(up).unit();  // the scene lies to the right of the track
    auto point = [&](double a) { return s.position + (up * -std::cos(a) + right * std::sin(a)) * r0; };
    double a0 = 0.0, a1 = 0.5 * kPi;
    if (ecef_to_geodetic(point(a0)).height > height)
      throw std::invalid_argument("clutter: a slant range of the product does not reach the ground");
    for (int it = 0; it < 80; ++it) {
      const double mid = 0.5 * (a0 + a1);
      (ecef_to_geodetic(point(mid)).height < height ? a0 : a1) = mid;
    }
    const Vec3 p = point(0.5 * (a0 + a1));
    constexpr double h = 0.05;
    auto range_at = [&](double dt) { return (p - orbit.state_at_offset(t + dt).position).norm(); };
    const double r = range_at(0.0);
    const double vr = std::sqrt(r * (range_at(h) - 2.0 * r + range_at(-h)) / (h * h));
    const double ta = time_of_doppler(fdc + half, r, vr, lambda), tb = time_of_doppler(fdc - half, r, vr, lambda);
    if (!std::isfinite(ta) || !std::isfinite(tb)) throw std::invalid_argument("clutter: centroid beyond the geometry");
    if (std::abs(ta + tb) < 0.2) return vr;
    // Far from zero Doppler the hyperbola is fitted to the orbit's range over the main lobe,
    // weighted by the two-way pattern (Gauss-Newton on Vr^2).
    constexpr int kFit = 33;
    double v2 = vr * vr;
    std::vector<double> ts(kFit), range(kFit), weight(kFit);
    for (std::size_t i = 0; i < ts.size(); ++i) {
      const double u = -1.0 + 2.0 * static_cast<double>(i) / (kFit - 1);
      ts[i] = 0.5 * (ta + tb) + 0.5 * (tb - ta) * u;
      range[i] = range_at(ts[i]);
      const double w = sinc(u * g.pattern_extent);
      weight[i] = w * w * w * w;
    }
    for (int it = 0; it < 8; ++it) {
      double num = 0.0, den = 0.0;
      for (std::size_t i = 0; i < ts.size(); ++i) {
        const double model = std::sqrt(r * r + v2 * ts[i] * ts[i]);
        const double slope = ts[i] * ts[i] / (2.0 * model);
        num += weight[i] * slope * (range[i] - model);
        den += weight[i] * slope * slope;
      }
      v2 += num / den;
    }
    return std::sqrt(v2);
  };
  // Nodes over the cells' two-way times: from a pulse and a margin before the near range to
  // a margin beyond the far range.
  const double lo = g.near_range_time - (g.pulse_length + 200.0 / fs);
  const double hi = g.near_range_time + (g.samples + 200.0) / fs;
  constexpr int kNodes = 9;
  std::vector<double> taus, speeds;
  for (int i = 0; i < kNodes; ++i) {
    const double tau = lo + (hi - lo) * i / (kNodes - 1);
    const double r0 = 0.5 * kSpeedOfLight * tau;
    // With a squinted beam the cells that echo at `time_offset` pass zero Doppler seconds away,
    // where the orbit has moved on: take Vr there.
    const double fdc = g.doppler_centroid ? g.doppler_centroid(tau) : 0.0;
    double vr = effective_velocity(time_offset, r0, fdc);
    for (int pass = 0; pass < 2 && fdc != 0.0; ++pass)
      vr = effective_velocity(time_offset - time_of_doppler(fdc, r0, vr, lambda), r0, fdc);
    taus.push_back(tau);
    speeds.push_back(vr);
  }
  g.effective_velocity = [taus, speeds](double tau) {
    const double x = (tau - taus.front()) / (taus.back() - taus.front()) * (static_cast<double>(taus.size()) - 1.0);
    const int i = std::clamp(static_cast<int>(std::floor(x)), 0, static_cast<int>(taus.size()) - 2);
    const double w = x - i;
    return speeds[static_cast<std::size_t>(i)] * (1.0 - w) + speeds[static_cast<std::size_t>(i) + 1] * w;
  };
}

double clutter_cell_energy(const ClutterGeometry& g) {
  check_geometry(g);
  const double tau = g.near_range_time + 0.5 * g.samples / g.sampling_frequency;
  const double r0 = 0.5 * kSpeedOfLight * tau, vr = g.effective_velocity(tau), fdc = g.doppler_centroid(tau);
  const double lambda = kSpeedOfLight / g.carrier_frequency;
  const double half = g.pattern_extent * 2.0 * g.satellite_speed / g.antenna_length;
  const double t0 = time_of_doppler(fdc + half, r0, vr, lambda), t1 = time_of_doppler(fdc - half, r0, vr, lambda);
  if (!std::isfinite(t0) || !std::isfinite(t1)) throw std::invalid_argument("clutter: centroid beyond the geometry");
  double sum = 0.0;
  for (long long j = static_cast<long long>(std::floor(t0 * g.prf)) - 1; j <= static_cast<long long>(std::ceil(t1 * g.prf)) + 1; ++j) {
    const double t = static_cast<double>(j) / g.prf;
    const double fd = -2.0 * vr * vr * t / (lambda * std::sqrt(r0 * r0 + vr * vr * t * t));
    const double x = g.antenna_length * (fd - fdc) / (2.0 * g.satellite_speed);
    if (std::abs(x) > g.pattern_extent) continue;
    const double w = sinc(x) * sinc(x);
    sum += w * w;
  }
  return sum * std::ceil(g.pulse_length * g.sampling_frequency - 1e-6);
}

Reflectivity random_reflectivity(const ClutterOptions& options, const ClutterGeometry& g, uint64_t seed) {
  const double sigma = std::sqrt(std::pow(10.0, options.power_db / 10.0) / clutter_cell_energy(g));
  return RandomScene(seed, sigma, options.contrast, g.samples,
                     static_cast<int>(std::ceil(g.pulse_length * g.sampling_frequency - 1e-6)));
}

ClutterEcho::ClutterEcho(ClutterGeometry geometry, Reflectivity reflectivity)
    : g_(std::move(geometry)), reflectivity_(std::move(reflectivity)) {
  check_geometry(g_);
  if (!reflectivity_) throw std::invalid_argument("clutter: no reflectivity");
  const double fs = g_.sampling_frequency, f0 = g_.carrier_frequency, prf = g_.prf;
  const double lambda = kSpeedOfLight / f0;
  pulse_samples_ = static_cast<int>(std::ceil(g_.pulse_length * fs - 1e-6));
  const double half = g_.pattern_extent * 2.0 * g_.satellite_speed / g_.antenna_length;

  // Extent of a cell's echo: lines of the main lobe, samples of the range walk.
  double t_min = 1e30, t_max = -1e30, walk = 0.0;
  const double tau_lo = g_.near_range_time - (g_.pulse_length + 64.0 / fs);
  const double tau_hi = g_.near_range_time + (g_.samples + kRangeGuard) / fs;
  for (int i = 0; i <= 8; ++i) {
    const double tau = tau_lo + (tau_hi - tau_lo) * i / 8.0;
    const double r0 = 0.5 * kSpeedOfLight * tau, vr = g_.effective_velocity(tau), fdc = g_.doppler_centroid(tau);
    if (!std::isfinite(vr) || vr <= 0.0 || !std::isfinite(fdc))
      throw std::invalid_argument("clutter: bad effective velocity or centroid");
    for (double f : {fdc - half, fdc, fdc + half}) {
      const double t = time_of_doppler(f, r0, vr, lambda);
      if (!std::isfinite(t)) throw std::invalid_argument("clutter: centroid beyond the geometry");
      t_min = std::min(t_min, t);
      t_max = std::max(t_max, t);
      const double d0 = std::sqrt(f0 * f0 - kSpeedOfLight * kSpeedOfLight * f * f / (4.0 * vr * vr));
      walk = std::max(walk, tau * (f0 / d0 - 1.0) * fs);
    }
  }
  const int rcm = static_cast<int>(std::ceil(walk)) + 1;
  az_lo_ = static_cast<long long>(std::floor(t_min * prf)) - kAzimuthGuard;
  az_hi_ = static_cast<long long>(std::ceil(t_max * prf)) + kAzimuthGuard;
  aliases_ = static_cast<int>(std::ceil((half * (1.0 + 0.5 * fs / f0) + 0.5 * prf) / prf));

  // Range blocks: equal widths, narrowed while the centroid moves too much over one.
  first_cell_ = -(pulse_samples_ + rcm + kRangeGuard);
  const int width = g_.samples + kRangeGuard - first_cell_;
  block_cells_ = std::min(g_.range_block, width);
  auto centroid_spread = [&](int cells) {
    double spread = 0.0;
    for (int n = first_cell_; n < g_.samples + kRangeGuard; n += cells) {
      const double a = g_.near_range_time + (n + g_.sample_offset) / fs;
      const double b = a + cells / fs;
      double lo = 1e30, hi = -1e30;
      for (int i = 0; i <= 4; ++i) {
        const double f = g_.doppler_centroid(a + (b - a) * i / 4.0);
        lo = std::min(lo, f);
        hi = std::max(hi, f);
      }
      spread = std::max(spread, hi - lo);
    }
    return spread;
  };
  while (block_cells_ > kMinRangeBlock && centroid_spread(block_cells_) > kCentroidStep)
    block_cells_ = std::max(kMinRangeBlock, block_cells_ / 2);
  range_blocks_ = (width + block_cells_ - 1) / block_cells_;
  block_cells_ = (width + range_blocks_ - 1) / range_blocks_;  // balanced
  pad_ = kRangeGuard;
  range_fft_ = dsp::genpow(pad_ + block_cells_ + rcm + pulse_samples_ + kRangeGuard, 1);

  // Azimuth blocks: the transform holds the block's lines and one aperture of cells.
  const long long span = az_hi_ - az_lo_ + 1;
  if (span > (1LL << 24)) throw std::invalid_argument("clutter: aperture too long");
  if (g_.lines + span <= g_.max_fft_lines) {
    mb_ = g_.lines;
  } else {
    const long long na0 = dsp::genpow(static_cast<int>(std::max<long long>(g_.max_fft_lines, span + 256)), 1);
    const long long blocks = (g_.lines + (na0 - span) - 1) / (na0 - span);
    mb_ = static_cast<int>((g_.lines + blocks - 1) / blocks);
  }
  na_ = dsp::genpow(static_cast<int>(mb_ + span), 1);
  if (na_ <= 0 || range_fft_ <= 0) throw std::invalid_argument("clutter: transform too long");

  // Spectrum of the sampled up-chirp, leading edge at sample 0.
  std::vector<fcomplex> chirp(static_cast<std::size_t>(range_fft_));
  const double rate = g_.chirp_bandwidth / g_.pulse_length;
  for (int k = 0; k < pulse_samples_; ++k) {
    const double v = k / fs - 0.5 * g_.pulse_length;
    const double phase = kPi * rate * v * v;
    chirp[static_cast<std::size_t>(k)] = {static_cast<float>(std::cos(phase)), static_cast<float>(std::sin(phase))};
  }
  {
    const EstimatePlanning planning;
    dsp::fft_c(range_fft_, range_fft_, 1, 1, 1, 0, chirp);
  }
  chirp_re_.resize(chirp.size());
  chirp_im_.resize(chirp.size());
  for (std::size_t i = 0; i < chirp.size(); ++i) {
    chirp_re_[i] = chirp[i].real();
    chirp_im_[i] = chirp[i].imag();
  }
  line_.resize(static_cast<std::size_t>(g_.samples));
}

std::span<const std::complex<float>> ClutterEcho::line(int l) {
  if (l < 0 || l >= g_.lines) throw std::out_of_range("clutter: line outside the product");
  const int block = l / mb_;
  if (block != block_) compute_block(block);
  const long long j = ((l - row0_) % na_ + na_) % na_;
  const std::size_t na = static_cast<std::size_t>(na_);
  for (std::size_t k = 0; k < line_.size(); ++k) line_[k] = accumulator_[k * na + static_cast<std::size_t>(j)];
  return line_;
}

void ClutterEcho::compute_block(int block) {
  const EstimatePlanning planning;
  const double fs = g_.sampling_frequency, f0 = g_.carrier_frequency, prf = g_.prf;
  const double c2 = kSpeedOfLight * kSpeedOfLight;
  const double xscale = g_.antenna_length / (2.0 * g_.satellite_speed);
  const double fmin = f0 - 0.5 * fs, fmax = f0 + 0.5 * fs;
  const std::size_t na = static_cast<std::size_t>(na_), cells = static_cast<std::size_t>(block_cells_);
  const std::size_t nfft = static_cast<std::size_t>(range_fft_), samples = static_cast<std::size_t>(g_.samples);

  block_ = -1;
  row0_ = static_cast<long long>(block) * mb_ - az_hi_;
  accumulator_.assign(samples * na, fcomplex{});
  std::vector<fcomplex> cellsT(cells * na), row(cells);
  std::vector<fcomplex> chunk(kChunkRows * nfft), sum(kChunkRows * nfft);

  dsp::fft_plan azimuth, range_forward, range_backward;
  if (dsp::fft_makep_c(azimuth, na_, na_, block_cells_, block_cells_, 1, 0, 1) != 0 ||
      dsp::fft_makep_c(range_forward, range_fft_, range_fft_, kChunkRows, kChunkRows, 1, 0, 1) != 0 ||
      dsp::fft_makep_c(range_backward, range_fft_, range_fft_, kChunkRows, kChunkRows, -1, 0, 1) != 0)
    throw std::runtime_error("clutter: no transform plan");

  // Range bins in the order of their frequencies, from -fs/2 up: bin order[i], frequency
  // (i - half) fs / nfft.
  const std::size_t half = nfft / 2;
  std::vector<std::size_t> order(nfft);
  std::vector<double> carrier(nfft);
  std::vector<dcomplex> column(nfft);
  for (std::size_t i = 0; i < nfft; ++i) {
    order[i] = (i + nfft - half) % nfft;
    const double f = (static_cast<double>(i) - static_cast<double>(half)) * fs / static_cast<double>(nfft);
    carrier[i] = f0 + f;
    // PRF P(fr) e^(-j pi/4) e^(-j 2 pi fr sample_offset / fs)
    column[i] = prf * dcomplex(chirp_re_[order[i]], chirp_im_[order[i]]) *
                std::polar(1.0, -0.25 * kPi - kTwoPi * f * g_.sample_offset / fs);
  }
  // Interpolation nodes along range frequency and along the cells.
  auto nodes = [](std::size_t n, std::size_t step) {
    std::vector<std::size_t> v;
    for (std::size_t i = 0; i + 1 < n; i += step) v.push_back(i);
    v.push_back(n - 1);
    return v;
  };
  const std::vector<std::size_t> range_nodes = nodes(nfft, kRangeStep), cell_nodes = nodes(cells, kCellStep);
  std::vector<double> node_gain(range_nodes.size()), node_cycles(range_nodes.size()), cell_cycles(cell_nodes.size());

  std::vector<double> tau(cells), inv(cells);
  std::vector<dcomplex> cell_factor(cells);
  std::vector<double> fa0(na);
  std::vector<char> active(kChunkRows);

  for (int rb = 0; rb < range_blocks_; ++rb) {
    const long long n0 = first_cell_ + static_cast<long long>(rb) * block_cells_;
    for (std::size_t i = 0; i < na; ++i) {
      reflectivity_(row0_ + static_cast<long long>(i), n0, row);
      for (std::size_t c = 0; c < cells; ++c) cellsT[c * na + i] = row[c];
    }
    dsp::pfft_c(azimuth, cellsT);

    const double tau_ref = g_.near_range_time + (static_cast<double>(n0) + 0.5 * block_cells_ + g_.sample_offset) / fs;
    const double fdc = g_.doppler_centroid(tau_ref), vr_ref = g_.effective_velocity(tau_ref);
    const double inv_ref = c2 / (4.0 * vr_ref * vr_ref);
    for (std::size_t c = 0; c < cells; ++c) {
      tau[c] = g_.near_range_time + (static_cast<double>(n0 + static_cast<long long>(c)) + g_.sample_offset) / fs;
      const double vr = g_.effective_velocity(tau[c]);
      inv[c] = c2 / (4.0 * vr * vr);
      // sqrt(c R0 / (2 Vr^2)) e^(-j 2 pi f0 tau): the carrier phase at zero Doppler.
      cell_factor[c] = std::polar(std::sqrt(tau[c] * inv[c]), -kTwoPi * frac(f0 * tau[c]));
    }
    for (std::size_t r = 0; r < na; ++r) fa0[r] = fdc + wrap(static_cast<double>(r) * prf / static_cast<double>(na) - fdc, prf);

    for (std::size_t r0 = 0; r0 < na; r0 += kChunkRows) {
      const std::size_t rows = std::min<std::size_t>(kChunkRows, na - r0);
      std::fill(sum.begin(), sum.end(), fcomplex{});
      bool any_alias = false;
      for (int k = -aliases_; k <= aliases_; ++k) {
        bool any = false;
        for (std::size_t p = 0; p < kChunkRows; ++p) {
          active[p] = 0;
          if (p >= rows) continue;
          const double fa = fa0[r0 + p] + k * prf;
          const double xa = xscale * (fa * f0 / fmax - fdc), xb = xscale * (fa * f0 / fmin - fdc);
          if (std::min(xa, xb) > g_.pattern_extent || std::max(xa, xb) < -g_.pattern_extent) continue;
          if (fa * fa * std::max(inv_ref, inv[0]) >= fmin * fmin) continue;
          active[p] = 1;
          any = true;
        }
        if (!any) continue;
        any_alias = true;
        // The part of e^(-j 2 pi D tau) that varies with range, exactly per cell:
        // e^(-j 2 pi (D(fa, f0) - f0) tau), a smooth phase interpolated between nodes.
        std::fill(chunk.begin(), chunk.end(), fcomplex{});
        for (std::size_t p = 0; p < rows; ++p) {
          if (!active[p]) continue;
          const double fa = fa0[r0 + p] + k * prf, fa2 = fa * fa;
          for (std::size_t i = 0; i < cell_nodes.size(); ++i) {
            const std::size_t c = cell_nodes[i];
            const double a = fa2 * inv[c];
            cell_cycles[i] = -a / (std::sqrt(f0 * f0 - a) + f0) * tau[c];
          }
          fcomplex* out = chunk.data() + p * nfft + static_cast<std::size_t>(pad_);
          const fcomplex* in = cellsT.data() + r0 + p;
          for (std::size_t i = 0; i + 1 < cell_nodes.size(); ++i) {
            const std::size_t c0 = cell_nodes[i], c1 = cell_nodes[i + 1];
            const double step = (cell_cycles[i + 1] - cell_cycles[i]) / static_cast<double>(c1 - c0);
            dcomplex phasor = std::polar(1.0, -kTwoPi * frac(cell_cycles[i]));
            const dcomplex turn = std::polar(1.0, -kTwoPi * step);
            const std::size_t last = (i + 2 == cell_nodes.size()) ? c1 : c1 - 1;
            for (std::size_t c = c0; c <= last; ++c) {
              out[c] = fcomplex(dcomplex(in[c * na]) * cell_factor[c] * phasor);
              phasor *= turn;
            }
          }
        }
        dsp::pfft_c(range_forward, chunk);
        // The rest of the transfer function at the block's reference range, smooth along range
        // frequency once its linear phase (the range walk) is taken out: exact at nodes,
        // interpolated between them.
        for (std::size_t p = 0; p < rows; ++p) {
          if (!active[p]) continue;
          const double fa = fa0[r0 + p] + k * prf;
          const double a = fa * fa * inv_ref;
          const double d0 = std::sqrt(f0 * f0 - a);
          const double d0m = -a / (d0 + f0);             // D(fa, f0) - f0
          const double walk = (f0 / d0 - 1.0) * tau_ref;  // cycles per Hz of range frequency
          for (std::size_t i = 0; i < range_nodes.size(); ++i) {
            const std::size_t n = range_nodes[i];
            const double F = carrier[n];
            const double x = xscale * (fa * f0 / F - fdc);
            node_gain[i] = 0.0;
            node_cycles[i] = 0.0;
            if (std::abs(x) > g_.pattern_extent || a >= F * F) continue;
            const double d = std::sqrt(F * F - a);
            const double w = sinc(x);
            node_gain[i] = w * w * F / (d * std::sqrt(d));
            node_cycles[i] = (-a / (d + F) - d0m) * tau_ref - walk * (F - f0);
          }
          const dcomplex rowf = std::polar(1.0, -kTwoPi * frac(fa * g_.line_offset / prf));
          const dcomplex walk_turn = std::polar(1.0, -kTwoPi * frac(walk * fs / static_cast<double>(nfft)));
          dcomplex walk_phasor = rowf * std::polar(1.0, -kTwoPi * frac(walk * (carrier[0] - f0)));
          const fcomplex* in = chunk.data() + p * nfft;
          fcomplex* acc = sum.data() + p * nfft;
          for (std::size_t i = 0; i + 1 < range_nodes.size(); ++i) {
            const std::size_t b0 = range_nodes[i], b1 = range_nodes[i + 1];
            const std::size_t last = (i + 2 == range_nodes.size()) ? b1 : b1 - 1;
            const double span = static_cast<double>(b1 - b0);
            if (node_gain[i] == 0.0 && node_gain[i + 1] == 0.0) {
              for (std::size_t b = b0; b <= last; ++b) walk_phasor *= walk_turn;
              continue;
            }
            const double gain_step = (node_gain[i + 1] - node_gain[i]) / span;
            dcomplex phasor = std::polar(1.0, -kTwoPi * node_cycles[i]);
            const dcomplex turn = std::polar(1.0, -kTwoPi * (node_cycles[i + 1] - node_cycles[i]) / span);
            double gain = node_gain[i];
            for (std::size_t b = b0; b <= last; ++b) {
              const std::size_t q = order[b];
              acc[q] += in[q] * fcomplex(column[b] * walk_phasor * phasor * gain);
              walk_phasor *= walk_turn;
              phasor *= turn;
              gain += gain_step;
            }
          }
        }
      }
      if (!any_alias) continue;
      dsp::pfft_c(range_backward, sum);
      for (std::size_t q = 0; q < nfft; ++q) {
        const long long k = static_cast<long long>(q) + n0 - pad_;
        if (k < 0 || k >= g_.samples) continue;
        fcomplex* out = accumulator_.data() + static_cast<std::size_t>(k) * na + r0;
        for (std::size_t p = 0; p < rows; ++p) out[p] += sum[p * nfft + q];
      }
    }
  }
  dsp::fft_c(na_, na_, g_.samples, g_.samples, -1, 0, accumulator_);
  block_ = block;
}

void add_clutter(std::span<std::complex<double>> echo, const ClutterGeometry& g, const Reflectivity& reflectivity) {
  const std::size_t samples = static_cast<std::size_t>(g.samples);
  if (echo.size() != static_cast<std::size_t>(g.lines) * samples)
    throw std::invalid_argument("clutter: echo matrix of the wrong size");
  ClutterEcho clutter(g, reflectivity);
  for (int l = 0; l < g.lines; ++l) {
    const auto v = clutter.line(l);
    std::complex<double>* out = echo.data() + static_cast<std::size_t>(l) * samples;
    for (std::size_t k = 0; k < samples; ++k) out[k] += std::complex<double>(v[k]);
  }
}

void add_clutter(std::span<std::complex<double>> echo, const ClutterGeometry& g, const ClutterOptions& options,
                 uint64_t seed) {
  if (!options.enabled()) return;
  add_clutter(echo, g, random_reflectivity(options, g, seed));
}

}  // namespace sar::simulator

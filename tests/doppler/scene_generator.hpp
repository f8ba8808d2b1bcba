#pragma once
// Range-compressed stripmap scenes with a known absolute Doppler centroid, for the estimator's
// tests and benchmark.
//
// The scene is made in the two-dimensional frequency domain: a random complex reflectivity is
// transformed, multiplied by the compressed chirp's range spectrum (flat over the bandwidth), by
// the two-way azimuth antenna pattern and by the exact hyperbolic phase of a point at the
// reference range, and transformed back. The antenna pattern at range frequency f_r is centred
// at fdc (f0 + f_r)/f0, the property both ambiguity estimators rest on; the hyperbolic phase
// gives the range migration the beat frequency estimator reads. Azimuth frequencies are taken
// at their absolute value (the aliases nearest the centroid), so a centroid of several PRFs is
// physical, not just a phase. A linear range slope of the centroid is obtained by blending two
// scenes of the same reflectivity with the near and far centroids.
#include <algorithm>
#include <cmath>
#include <complex>
#include <cstdint>
#include <numbers>
#include <vector>

#include "dsp/fft.hpp"

namespace sar::doppler::testing {

struct SceneSpec {
  int lines = 2048;
  int samples = 1024;
  double prf = 1652.4;
  double fs = 19.20768e6;
  double bandwidth = 16e6;
  double f0 = 5.331e9;
  double speed = 7100.0;
  double range = 850e3;
  double antenna = 10.0;
  double centroid = 0.0;       ///< Hz at the centre sample
  double centroidSlope = 0.0;  ///< Hz per range sample
  double noise = 0.1;          ///< noise power over clutter power
  bool highContrast = false;   ///< bright point scatterers over part of the range extent
  double brightFraction = 0.5; ///< near-range fraction of the samples holding them
  double brightPower = 300.0;  ///< a scatterer's reflectivity power over the clutter's
  int brightSpacing = 8192;    ///< reflectivity cells per bright scatterer in that part
  bool noiseOnly = false;
  double clutterPower = 1.0;   ///< reflectivity power of the distributed clutter
  unsigned seed = 1;

  double centroidAt(double sample) const { return centroid + centroidSlope * (sample - samples / 2.0); }
};

/// A small, fast and portable generator (xoshiro256+ seeded by splitmix64), so that a scene is
/// the same on every platform.
class Random {
 public:
  explicit Random(uint64_t seed) {
    for (auto& w : s_) {
      seed += 0x9E3779B97F4A7C15ull;
      uint64_t z = seed;
      z = (z ^ (z >> 30)) * 0xBF58476D1CE4E5B9ull;
      z = (z ^ (z >> 27)) * 0x94D049BB133111EBull;
      w = z ^ (z >> 31);
    }
  }
  uint64_t next() {
    const uint64_t r = s_[0] + s_[3];
    const uint64_t t = s_[1] << 17;
    s_[2] ^= s_[0];
    s_[3] ^= s_[1];
    s_[1] ^= s_[2];
    s_[0] ^= s_[3];
    s_[2] ^= t;
    s_[3] = (s_[3] << 45) | (s_[3] >> 19);
    return r;
  }
  /// Uniform in [0, 1).
  double uniform() { return static_cast<double>(next() >> 11) * 0x1.0p-53; }
  /// Uniform in [-1, 1).
  float symmetric() { return static_cast<float>(2.0 * uniform() - 1.0); }
  int below(int n) { return static_cast<int>(uniform() * n); }
  /// Circular complex Gaussian of unit power (Box-Muller).
  std::complex<float> gaussian() {
    const float u = static_cast<float>(1.0 - uniform()), v = static_cast<float>(uniform());
    const float r = std::sqrt(-std::log(u));
    return std::polar(r, 6.2831853f * v);
  }

 private:
  uint64_t s_[4];
};

inline double sinc(double x) {
  if (x == 0.0) return 1.0;
  const double v = std::numbers::pi * x;
  return std::sin(v) / v;
}

/// The reflectivity spectrum last made, kept for the next scene of the same reflectivity.
inline dsp::cvector& reflectivity_cache() {
  static dsp::cvector spectrum;
  return spectrum;
}
inline void clear_reflectivity_cache() { dsp::cvector().swap(reflectivity_cache()); }

/// Two-dimensional spectrum of the scene's reflectivity. The last one is kept: scenes that
/// differ only in their Doppler share it.
inline const dsp::cvector& reflectivity_spectrum(const SceneSpec& p) {
  struct Key {
    int lines, samples;
    unsigned seed;
    bool high;
    double fraction, power, clutter;
    int spacing;
    bool operator==(const Key&) const = default;
  };
  static Key last{};
  dsp::cvector& spectrum = reflectivity_cache();
  const Key key{p.lines, p.samples, p.seed, p.highContrast, p.brightFraction, p.brightPower, p.clutterPower,
                p.brightSpacing};
  const int nl = p.lines, ns = p.samples;
  const std::size_t count = static_cast<std::size_t>(nl) * static_cast<std::size_t>(ns);
  if (key == last && spectrum.size() == count) return spectrum;
  spectrum.resize(count);
  Random gen(p.seed);
  // Uniform components are enough: every output sample sums thousands of cells and is
  // circular Gaussian.
  const float ua = static_cast<float>(std::sqrt(1.5 * p.clutterPower));
  for (auto& v : spectrum) v = std::complex<float>(gen.symmetric(), gen.symmetric()) * ua;
  if (p.highContrast) {
    const int brightSamples = static_cast<int>(p.brightFraction * ns);
    const int64_t n = static_cast<int64_t>(brightSamples) * nl / std::max(1, p.brightSpacing);
    const float amp = static_cast<float>(std::sqrt(p.brightPower));
    for (int64_t k = 0; k < n; ++k) {
      const int l = gen.below(nl), s = gen.below(std::max(1, brightSamples));
      spectrum[static_cast<std::size_t>(l) * ns + s] = std::polar(amp, 3.14159265f * gen.symmetric());
    }
  }
  dsp::fft_c(ns, ns, nl, nl, 1, 1, spectrum);
  last = key;
  return spectrum;
}

/// lines x samples fcomplex, row-major, one row an azimuth line.
inline std::vector<std::complex<float>> make_scene(const SceneSpec& p) {
  using cf = std::complex<float>;
  const int nl = p.lines, ns = p.samples;
  const std::size_t count = static_cast<std::size_t>(nl) * static_cast<std::size_t>(ns);
  std::vector<cf> out(count);
  if (!p.noiseOnly) {
    dsp::cvector refl = reflectivity_spectrum(p);
    dsp::cvector far = refl;
    const double c = 299792458.0;
    const double k4 = 4.0 * std::numbers::pi * p.range / c;
    const double dnear = p.centroidAt(0.0), dfar = p.centroidAt(ns - 1.0);
    const double pat = p.antenna / (2.0 * p.speed);
    // Transfer function at range frequency index qs (ascending, qs = ns/2 is zero) for one
    // azimuth frequency and alias: near and far pattern, hyperbolic phase less the zero-Doppler
    // delay, -k4 (sqrt(fc^2 - b^2) - fc).
    struct Node {
      double gn, gf, phase;
    };
    auto node = [&](int qs, double f) {
      const double fr = (qs - ns / 2) * p.fs / ns;
      const double fc = p.f0 + fr, scale = fc / p.f0;
      const double b = c * f / (2.0 * p.speed);
      const double gn = sinc((f - dnear * scale) * pat), gf = sinc((f - dfar * scale) * pat);
      return Node{gn * gn, gf * gf, k4 * b * b / (std::sqrt(fc * fc - b * b) + fc)};
    };
    // Exact at every kStep-th range frequency, linear in between (pattern and phase vary
    // smoothly over the range band; the phase departs from a line by less than 1e-4 rad over a step).
    constexpr int kStep = 32;
    const int nodes = ns / kStep + 2;
    std::vector<Node> tab(static_cast<std::size_t>(nodes) * 3);
    for (int k = 0; k < nl; ++k) {
      const double fk = (k < (nl + 1) / 2 ? k : k - nl) * p.prf / nl;
      const long n0 = std::lround((0.5 * (dnear + dfar) - fk) / p.prf);
      for (int j = 0; j < nodes; ++j)
        for (int a = 0; a < 3; ++a)
          tab[static_cast<std::size_t>(j) * 3 + a] = node(j * kStep, fk + (n0 - 1 + a) * p.prf);
      for (int j = 0; j * kStep < ns; ++j) {
        std::complex<double> rot[3], ph[3];
        for (int a = 0; a < 3; ++a) {
          const Node& u = tab[static_cast<std::size_t>(j) * 3 + a];
          const Node& v = tab[static_cast<std::size_t>(j + 1) * 3 + a];
          ph[a] = std::polar(1.0, u.phase);
          rot[a] = std::polar(1.0, (v.phase - u.phase) / kStep);
        }
        for (int i = 0; i < kStep && j * kStep + i < ns; ++i) {
          const int qs = j * kStep + i;
          const int q = (qs + ns - ns / 2) % ns;
          const std::size_t idx = static_cast<std::size_t>(k) * ns + q;
          const double fr = (qs - ns / 2) * p.fs / ns;
          if (std::fabs(fr) > p.bandwidth / 2.0) {
            refl[idx] = far[idx] = cf(0.0f, 0.0f);
          } else {
            const double t = static_cast<double>(i) / kStep;
            std::complex<double> hn(0.0, 0.0), hf(0.0, 0.0);
            for (int a = 0; a < 3; ++a) {
              const Node& u = tab[static_cast<std::size_t>(j) * 3 + a];
              const Node& v = tab[static_cast<std::size_t>(j + 1) * 3 + a];
              hn += (u.gn + (v.gn - u.gn) * t) * ph[a];
              hf += (u.gf + (v.gf - u.gf) * t) * ph[a];
            }
            refl[idx] *= cf(static_cast<float>(hn.real()), static_cast<float>(hn.imag()));
            far[idx] *= cf(static_cast<float>(hf.real()), static_cast<float>(hf.imag()));
          }
          for (int a = 0; a < 3; ++a) ph[a] *= rot[a];
        }
      }
    }
    dsp::fft_c(ns, ns, nl, nl, -1, -1, refl);
    dsp::fft_c(ns, ns, nl, nl, -1, -1, far);
    // Unit clutter power (or unit mean power when there is no clutter part).
    double power = 0.0, total = 0.0, clutterSamples = 0.0;
    for (int l = 0; l < nl; ++l)
      for (int s = 0; s < ns; ++s) {
        const std::size_t idx = static_cast<std::size_t>(l) * ns + s;
        const float w = ns > 1 ? static_cast<float>(s) / static_cast<float>(ns - 1) : 0.0f;
        out[idx] = refl[idx] * (1.0f - w) + far[idx] * w;
        const double e = std::norm(out[idx]);
        total += e;
        if (!p.highContrast || s >= static_cast<int>(p.brightFraction * ns)) {
          power += e;
          clutterSamples += 1.0;
        }
      }
    const double mean = power > 0.0 ? power / clutterSamples : total / static_cast<double>(count);
    const float norm = mean > 0.0 ? static_cast<float>(1.0 / std::sqrt(mean)) : 1.0f;
    for (auto& v : out) v *= norm;
  }
  Random gen(p.seed * 2654435761u + 12345u);
  const float sigma = static_cast<float>(std::sqrt(p.noiseOnly ? 1.0 : p.noise));
  if (sigma > 0.0f)
    for (auto& v : out) v += gen.gaussian() * sigma;
  return out;
}

}  // namespace sar::doppler::testing

#pragma once
// What a point target's response should be in an IM SLC: the widths and sidelobe ratios of the
// processed bands, measured on the theoretical response as the analyser measures the image.
#include <cmath>
#include <functional>
#include <vector>

namespace sar::test {

inline constexpr double kPi = 3.14159265358979323846;

inline double sinc(double u) { return u == 0.0 ? 1.0 : std::sin(kPi * u) / (kPi * u); }

// Width, peak sidelobe and integrated sidelobe ratios of a symmetric power response p(x), x in
// pixels, measured as the analyser measures them: mainlobe between the first minima, sidelobe
// region out to 10 resolutions from the peak.
struct Lobes {
  double width = 0.0, pslr = 0.0, islr = 0.0;
};

inline Lobes lobes_of(const std::function<double(double)>& power) {
  Lobes l;
  const double peak = power(0.0);
  double lo = 0.0, hi = 2.0;
  for (int it = 0; it < 50; ++it) {
    const double mid = 0.5 * (lo + hi);
    (power(mid) > 0.5 * peak ? lo : hi) = mid;
  }
  l.width = 2.0 * lo;
  const double step = 0.005;
  double null = step;
  while (power(null + step) < power(null)) null += step;
  const double span = 10.0 * l.width;
  double main = 0.0, side = 0.0, highest = 0.0;
  for (double x = 0.5 * step; x < span; x += step) {
    const double v = power(x);
    (x < null ? main : side) += v;
    if (x > null) highest = std::max(highest, v);
  }
  l.pslr = 10.0 * std::log10(highest / peak);
  l.islr = 10.0 * std::log10(side / main);
  return l;
}

// Azimuth response in lines with the whole PRF processed and the two-way antenna pattern as
// the only weighting.
inline Lobes azimuth_theory(double prf, double velocity, double antenna) {
  const int n = 1024;
  std::vector<double> weight(n);
  for (int i = 0; i < n; ++i) {
    const double g = sinc(antenna * (i - n / 2) * prf / n / (2.0 * velocity));
    weight[static_cast<std::size_t>(i)] = g * g;
  }
  return lobes_of([&](double x) {
    double re = 0.0;
    for (int i = 0; i < n; ++i) re += weight[static_cast<std::size_t>(i)] * std::cos(2 * kPi * (i - n / 2) * x / n);
    return re * re;
  });
}

// Range response in samples of an unweighted band B sampled at fs.
inline Lobes range_theory(double bandwidth, double fs) {
  return lobes_of([&](double x) {
    const double v = sinc(bandwidth * x / fs);
    return v * v;
  });
}

}  // namespace sar::test

// Parks-McClellan design of symmetric (linear-phase) multiband FIR filters.
//
// The amplitude of a symmetric filter is a cosine polynomial: for odd N,
// A(f) = sum_{k<r} a_k cos(2 pi f k) with r = (N + 1)/2; for even N, A(f) = cos(pi f) P(f) with
// P such a polynomial of r = N/2 terms, which turns into the odd case with desired D/cos(pi f)
// and weight W cos(pi f). The Remez exchange finds the polynomial whose weighted error
// alternates with equal magnitude on r + 1 extremal frequencies of a dense grid; the
// polynomial is handled in barycentric form in x = cos(2 pi f).
#include <Eigen/Dense>
#include <algorithm>
#include <cmath>
#include <cstdint>
#include <cstdio>
#include <numbers>
#include <stdexcept>
#include <vector>

#include "base/diagnostics.hpp"
#include "dsp/filters.hpp"
#include "base/constants.hpp"

namespace sar::dsp {
namespace {

using base::kPi;
constexpr int kGridDensity = 16;
constexpr int kMaxIterations = 60;
constexpr double kConvergence = 1e-7;

struct Grid {
  std::vector<double> f, d, w;
  std::vector<int> band;
};

// Lagrange interpolation in barycentric form through (x[k], y[k]).
class Barycentric {
 public:
  Barycentric(std::vector<double> x, std::vector<double> y) : x_(std::move(x)), y_(std::move(y)), w_(x_.size()) {
    for (std::size_t k = 0; k < x_.size(); ++k) {
      double prod = 1.0;
      // Factors of 2 keep the products of differences in [-1, 1] near unit size.
      for (std::size_t j = 0; j < x_.size(); ++j)
        if (j != k) prod *= 2.0 * (x_[k] - x_[j]);
      w_[k] = 1.0 / prod;
    }
  }
  double operator()(double x) const {
    double num = 0.0, den = 0.0;
    for (std::size_t k = 0; k < x_.size(); ++k) {
      const double diff = x - x_[k];
      if (diff == 0.0) return y_[k];
      const double t = w_[k] / diff;
      num += t * y_[k];
      den += t;
    }
    return num / den;
  }
  const std::vector<double>& weights() const { return w_; }

 private:
  std::vector<double> x_, y_, w_;
};

Grid make_grid(int r, bool odd, int nbands, std::span<const double> bands, std::span<const double> desired,
               std::span<const double> weights) {
  Grid g;
  const double delf = 0.5 / (kGridDensity * r);
  for (int b = 0; b < nbands; ++b) {
    double lo = bands[2 * b], hi = bands[2 * b + 1];
    // An even-length symmetric filter is 0 at half the sampling rate: keep off that point.
    if (!odd) {
      hi = std::min(hi, 0.5 - delf);
      if (lo > hi) continue;
    }
    const int m = std::max(1, static_cast<int>(std::ceil((hi - lo) / delf)));
    for (int k = 0; k <= m; ++k) {
      if (k > 0 && hi == lo) break;
      const double f = lo + (hi - lo) * k / m;
      double dv = desired[b], wv = weights[b];
      if (!odd) {
        const double c = std::cos(kPi * f);
        dv /= c;
        wv *= c;
      }
      g.f.push_back(f);
      g.d.push_back(dv);
      g.w.push_back(wv);
      g.band.push_back(b);
    }
  }
  return g;
}

// Local extrema of the error with alternating signs, reduced to `want` points.
std::vector<int> find_extremals(const std::vector<double>& e, const std::vector<int>& band, std::size_t want) {
  const int n = static_cast<int>(e.size());
  std::vector<int> c;
  for (int i = 0; i < n; ++i) {
    if (e[i] == 0.0) continue;
    const bool hasL = i > 0 && band[i - 1] == band[i];
    const bool hasR = i + 1 < n && band[i + 1] == band[i];
    const double s = e[i] > 0 ? 1.0 : -1.0;
    if ((!hasL || s * e[i] >= s * e[i - 1]) && (!hasR || s * e[i] >= s * e[i + 1])) c.push_back(i);
  }
  auto same_sign = [&](int a, int b) { return (e[a] > 0) == (e[b] > 0); };
  auto merge = [&](std::vector<int>& v) {
    std::vector<int> out;
    for (int i : v) {
      if (!out.empty() && same_sign(out.back(), i)) {
        if (std::fabs(e[i]) > std::fabs(e[out.back()])) out.back() = i;
      } else {
        out.push_back(i);
      }
    }
    v.swap(out);
  };
  merge(c);
  while (c.size() > want) {
    if (c.size() == want + 1) {
      // Dropping an end keeps the alternation.
      if (std::fabs(e[c.front()]) < std::fabs(e[c.back()]))
        c.erase(c.begin());
      else
        c.pop_back();
      continue;
    }
    const auto weakest = std::min_element(c.begin(), c.end(), [&](int a, int b) { return std::fabs(e[a]) < std::fabs(e[b]); });
    c.erase(weakest);
    merge(c);
  }
  return c;
}

}  // namespace

int remezOBX(std::span<fcomplex> filter, int N, int nbands, std::span<const double> bands,
             std::span<const double> desired, std::span<const double> weights) {
  auto reject = [](const char* text) {
    base::report(base::kReportError, text);
    return 10;
  };
  if (N < 3) return reject("remezOBX: at least 3 taps are needed");
  if (nbands < 1 || bands.size() < 2 * static_cast<std::size_t>(nbands) ||
      desired.size() < static_cast<std::size_t>(nbands) || weights.size() < static_cast<std::size_t>(nbands))
    return reject("remezOBX: missing band edges, desired values or weights");
  for (int i = 0; i < 2 * nbands; ++i) {
    const double v = bands[static_cast<std::size_t>(i)];
    if (!(v >= 0.0 && v <= 0.5) || (i > 0 && v < bands[static_cast<std::size_t>(i - 1)]))
      return reject("remezOBX: band edges must increase within [0, 0.5]");
  }
  for (int b = 0; b < nbands; ++b)
    if (!(weights[static_cast<std::size_t>(b)] > 0.0)) return reject("remezOBX: weights must be positive");
  if (filter.size() < static_cast<std::size_t>(N)) {
    char msg[120];
    std::snprintf(msg, sizeof msg, "remezOBX: filter holds %zu taps, %d are needed", filter.size(), N);
    throw std::invalid_argument(msg);
  }

  const bool odd = N % 2 == 1;
  const int r = odd ? (N + 1) / 2 : N / 2;
  const Grid g = make_grid(r, odd, nbands, bands, desired, weights);
  const int ngrid = static_cast<int>(g.f.size());
  if (ngrid < r + 1) return reject("remezOBX: the bands are too narrow for the filter length");

  std::vector<int> ext(static_cast<std::size_t>(r + 1));
  for (int k = 0; k <= r; ++k) ext[static_cast<std::size_t>(k)] = static_cast<int>(static_cast<std::int64_t>(k) * (ngrid - 1) / r);

  auto xof = [&](int i) { return std::cos(2.0 * kPi * g.f[static_cast<std::size_t>(i)]); };
  std::vector<double> err(static_cast<std::size_t>(ngrid));
  bool converged = false;
  std::vector<double> xs, ys;
  for (int iter = 0; iter < kMaxIterations; ++iter) {
    // Deviation delta of the alternation through the r + 1 extremals.
    std::vector<double> xe(static_cast<std::size_t>(r + 1));
    for (int k = 0; k <= r; ++k) xe[static_cast<std::size_t>(k)] = xof(ext[static_cast<std::size_t>(k)]);
    const Barycentric all(xe, std::vector<double>(xe.size(), 0.0));
    double num = 0.0, den = 0.0;
    for (int k = 0; k <= r; ++k) {
      const auto i = static_cast<std::size_t>(ext[static_cast<std::size_t>(k)]);
      const double ad = all.weights()[static_cast<std::size_t>(k)];
      num += ad * g.d[i];
      den += ad * (k % 2 == 0 ? 1.0 : -1.0) / g.w[i];
    }
    const double delta = num / den;
    xs.assign(xe.begin(), xe.end() - 1);
    ys.resize(static_cast<std::size_t>(r));
    for (int k = 0; k < r; ++k) {
      const auto i = static_cast<std::size_t>(ext[static_cast<std::size_t>(k)]);
      ys[static_cast<std::size_t>(k)] = g.d[i] - (k % 2 == 0 ? 1.0 : -1.0) * delta / g.w[i];
    }
    const Barycentric amp(xs, ys);
    for (int i = 0; i < ngrid; ++i)
      err[static_cast<std::size_t>(i)] = g.w[static_cast<std::size_t>(i)] * (g.d[static_cast<std::size_t>(i)] - amp(xof(i)));

    std::vector<int> next = find_extremals(err, g.band, static_cast<std::size_t>(r + 1));
    if (next.size() < static_cast<std::size_t>(r + 1)) break;  // lost the alternation: keep this design
    double emax = 0.0, emin = INFINITY;
    for (int i : next) {
      emax = std::max(emax, std::fabs(err[static_cast<std::size_t>(i)]));
      emin = std::min(emin, std::fabs(err[static_cast<std::size_t>(i)]));
    }
    if (emax - emin <= kConvergence * emax) {
      converged = true;
      break;
    }
    ext = std::move(next);
  }
  if (!converged) base::report(base::kReportWarning, "remezOBX: the exchange did not converge");

  // Taps from the amplitude at r Chebyshev nodes: a DCT-II (odd N) or DCT-IV (even N) system.
  const Barycentric amp(xs, ys);
  Eigen::MatrixXd C(r, r);
  Eigen::VectorXd A(r);
  for (int m = 0; m < r; ++m) {
    const double f = (m + 0.5) / (2.0 * r);
    const double p = amp(std::cos(2.0 * kPi * f));
    A(m) = odd ? p : p * std::cos(kPi * f);
    for (int k = 0; k < r; ++k) C(m, k) = odd ? std::cos(2.0 * kPi * f * k) : std::cos(2.0 * kPi * f * (k + 0.5));
  }
  const Eigen::VectorXd coef = C.partialPivLu().solve(A);
  std::vector<double> h(static_cast<std::size_t>(N));
  if (odd) {
    const int M = r - 1;
    h[static_cast<std::size_t>(M)] = coef(0);
    for (int k = 1; k < r; ++k) h[static_cast<std::size_t>(M - k)] = h[static_cast<std::size_t>(M + k)] = coef(k) / 2.0;
  } else {
    for (int k = 0; k < r; ++k) h[static_cast<std::size_t>(r - 1 - k)] = h[static_cast<std::size_t>(r + k)] = coef(k) / 2.0;
  }
  for (int i = 0; i < N; ++i) filter[static_cast<std::size_t>(i)] = fcomplex(static_cast<float>(h[static_cast<std::size_t>(i)]), 0.0f);
  return 0;
}

}  // namespace sar::dsp

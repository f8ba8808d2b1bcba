#include "dsp/optim.hpp"

#include <algorithm>
#include <cmath>

#include "base/diagnostics.hpp"

namespace sar::dsp {
namespace {
constexpr int kMaxIterations = 100;
constexpr double kGolden = 0.3819660112501051;  // (3 - sqrt 5) / 2
constexpr double kTiny = 1.0e-10;               // absolute floor of the tolerance near x = 0
}  // namespace

int brentOBX(double ax, double bx, double cx, const Function1D& f, double tol, double& xmin, double& fmin) {
  double a = std::min(ax, cx), b = std::max(ax, cx);
  double x = bx, w = bx, v = bx;
  double fx = f(x), fw = fx, fv = fx;
  double d = 0.0, e = 0.0;
  for (int iter = 0; iter < kMaxIterations; ++iter) {
    const double xm = 0.5 * (a + b);
    const double tol1 = tol * std::fabs(x) + kTiny, tol2 = 2.0 * tol1;
    if (std::fabs(x - xm) <= tol2 - 0.5 * (b - a)) {
      xmin = x;
      fmin = fx;
      return 0;
    }
    bool golden = true;
    if (std::fabs(e) > tol1) {
      // Parabola through x, w, v; accepted only if it falls inside the bracket and moves less
      // than half the step before last.
      const double r = (x - w) * (fx - fv);
      double q = (x - v) * (fx - fw);
      double p = (x - v) * q - (x - w) * r;
      q = 2.0 * (q - r);
      if (q > 0.0) p = -p;
      q = std::fabs(q);
      const double eprev = e;
      e = d;
      if (!(std::fabs(p) >= std::fabs(0.5 * q * eprev) || p <= q * (a - x) || p >= q * (b - x))) {
        d = p / q;
        const double u = x + d;
        if (u - a < tol2 || b - u < tol2) d = std::copysign(tol1, xm - x);
        golden = false;
      }
    }
    if (golden) {
      e = (x >= xm) ? a - x : b - x;
      d = kGolden * e;
    }
    const double u = std::fabs(d) >= tol1 ? x + d : x + std::copysign(tol1, d);
    const double fu = f(u);
    if (fu <= fx) {
      (u >= x ? a : b) = x;
      v = w;
      fv = fw;
      w = x;
      fw = fx;
      x = u;
      fx = fu;
    } else {
      (u < x ? a : b) = u;
      if (fu <= fw || w == x) {
        v = w;
        fv = fw;
        w = u;
        fw = fu;
      } else if (fu <= fv || v == x || v == w) {
        v = u;
        fv = fu;
      }
    }
  }
  xmin = x;
  fmin = fx;
  base::report(base::kReportError, "Too many iterations in brentOBX");
  return 1;
}

int optim_brOBX(const Function1D& f, double a, double b, double tol, double& xmin, double& fmin) {
  const double lo = std::min(a, b), hi = std::max(a, b);
  return brentOBX(lo, lo + kGolden * (hi - lo), hi, f, tol, xmin, fmin);
}

int rtbisOBX(const Function1D& f, double x1, double x2, double xacc, double& root) {
  const double f1 = f(x1), f2 = f(x2);
  if (f1 == 0.0) {
    root = x1;
    return 0;
  }
  if (f2 == 0.0) {
    root = x2;
    return 0;
  }
  if ((f1 < 0.0) == (f2 < 0.0)) {
    base::report(base::kReportError, "Root must be bracketed for bisection in rtbisOBX");
    return 10;
  }
  // Keep rtb on the negative side and step towards the positive one.
  double dx = f1 < 0.0 ? x2 - x1 : x1 - x2;
  double rtb = f1 < 0.0 ? x1 : x2;
  for (int j = 0; j < 200; ++j) {
    dx *= 0.5;
    const double xmid = rtb + dx;
    const double fmid = f(xmid);
    if (fmid <= 0.0) rtb = xmid;
    if (std::fabs(dx) < xacc || fmid == 0.0) {
      root = rtb;
      return 0;
    }
  }
  root = rtb;
  base::report(base::kReportError, "Too many bisections in rtbisOBX");
  return 1;
}

}  // namespace sar::dsp

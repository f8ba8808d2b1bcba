#pragma once
// One-dimensional minimisation and root finding.
//
// Status: 0 success; 1 no convergence within the iteration limit (the best point so far is
// still returned); 10 a rejected input (a root that is not bracketed).
#include <functional>

namespace sar::dsp {

using Function1D = std::function<double(double)>;

/// Brent's method: the minimum of f between ax and cx, starting from bx inside that interval.
/// tol is fractional: the abscissa is found to about tol |x|. xmin and fmin receive the point
/// and the value there.
int brentOBX(double ax, double bx, double cx, const Function1D& f, double tol, double& xmin, double& fmin);

/// Driver: Brent's method over [a, b], started at the golden section of the interval. A minimum
/// on the boundary is approached to within the tolerance.
int optim_brOBX(const Function1D& f, double a, double b, double tol, double& xmin, double& fmin);

/// A root of f between x1 and x2 by bisection, to within xacc. f(x1) and f(x2) must differ in
/// sign (or one be 0), else 10.
int rtbisOBX(const Function1D& f, double x1, double x2, double xacc, double& root);

}  // namespace sar::dsp

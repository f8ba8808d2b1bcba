#include "dsp/fitting.hpp"

#include <Eigen/Dense>
#include <Eigen/SVD>
#include <cmath>
#include <cstdint>
#include <cstdio>
#include <stdexcept>
#include <vector>

#include "base/diagnostics.hpp"

namespace sar::dsp {
namespace {

void require(const char* what, const char* which, std::size_t have, std::size_t need) {
  if (have >= need) return;
  char msg[200];
  std::snprintf(msg, sizeof msg, "%s: %s holds %zu values, %zu are needed", what, which, have, need);
  throw std::invalid_argument(msg);
}

int rejected(const char* text) {
  base::report(base::kReportError, text);
  return 10;
}

int singular(const char* routine) {
  char msg[120];
  std::snprintf(msg, sizeof msg, "Singular matrix in routine %s", routine);
  base::report(base::kReportError, msg);
  return 1;
}

// The weighted design of a fit: rows f_j(x_i)/sig_i of the fitted terms, right side
// (y_i - held terms)/sig_i, and every basis row kept for chisq.
struct Design {
  Eigen::MatrixXd A;     // n x mfit
  Eigen::VectorXd rhs;   // n
  Eigen::MatrixXd full;  // n x ma, unweighted basis values
  std::vector<int> fitted;
};

template <class Basis>
int build_design(const char* routine, std::span<const double> x, std::span<const double> y,
                 std::span<const double> sig, std::span<const double> a, std::span<const int> mask, Basis&& basis,
                 Design& d) {
  const std::size_t n = x.size(), ma = a.size();
  require(routine, "y", y.size(), n);
  require(routine, "sig", sig.size(), n);
  require(routine, "mask", mask.size(), ma);
  for (std::size_t j = 0; j < ma; ++j)
    if (mask[j] != 0) d.fitted.push_back(static_cast<int>(j));
  if (d.fitted.empty()) return rejected("lfitdOBX: no parameters to be fitted");
  for (std::size_t i = 0; i < n; ++i)
    if (sig[i] == 0.0 || !std::isfinite(sig[i])) return rejected("lfitdOBX: a point has a standard deviation of 0");
  const auto mfit = static_cast<Eigen::Index>(d.fitted.size());
  d.A.resize(static_cast<Eigen::Index>(n), mfit);
  d.rhs.resize(static_cast<Eigen::Index>(n));
  d.full.resize(static_cast<Eigen::Index>(n), static_cast<Eigen::Index>(ma));
  std::vector<double> afunc(ma);
  for (std::size_t i = 0; i < n; ++i) {
    std::fill(afunc.begin(), afunc.end(), 0.0);
    basis(static_cast<int>(i), x[i], std::span<double>(afunc));
    double yi = y[i];
    for (std::size_t j = 0; j < ma; ++j) {
      d.full(static_cast<Eigen::Index>(i), static_cast<Eigen::Index>(j)) = afunc[j];
      if (mask[j] == 0) yi -= a[j] * afunc[j];
    }
    const double w = 1.0 / sig[i];
    for (Eigen::Index k = 0; k < mfit; ++k) d.A(static_cast<Eigen::Index>(i), k) = afunc[static_cast<std::size_t>(d.fitted[k])] * w;
    d.rhs(static_cast<Eigen::Index>(i)) = yi * w;
  }
  return 0;
}

double chi_square(const Design& d, std::span<const double> y, std::span<const double> sig, std::span<const double> a) {
  const Eigen::Map<const Eigen::VectorXd> av(a.data(), static_cast<Eigen::Index>(a.size()));
  const Eigen::VectorXd model = d.full * av;
  double chisq = 0;
  for (Eigen::Index i = 0; i < model.size(); ++i) {
    const double r = (y[static_cast<std::size_t>(i)] - model(i)) / sig[static_cast<std::size_t>(i)];
    chisq += r * r;
  }
  return chisq;
}

// Unit-norm columns: the QR's rank decision and the covariance then do not depend on the
// units of the basis (x^4 of thousands of samples beside 1).
Eigen::VectorXd equilibrate(Eigen::MatrixXd& A) {
  Eigen::VectorXd s(A.cols());
  for (Eigen::Index j = 0; j < A.cols(); ++j) {
    s(j) = A.col(j).norm();
    if (s(j) > 0) A.col(j) /= s(j);
  }
  return s;
}

template <class Basis>
int lfit_impl(const char* routine, std::span<const double> x, std::span<const double> y, std::span<const double> sig,
              std::span<double> a, std::span<const int> mask, RowMatrixXd& covar, double& chisq, Basis&& basis) {
  Design d;
  if (int st = build_design(routine, x, y, sig, a, mask, basis, d)) return st;
  const Eigen::Index mfit = d.A.cols();
  if (d.A.rows() < mfit) return singular(routine);
  const Eigen::VectorXd s = equilibrate(d.A);
  if ((s.array() == 0.0).any()) return singular(routine);
  Eigen::ColPivHouseholderQR<Eigen::MatrixXd> qr(d.A);
  if (qr.rank() < mfit) return singular(routine);
  const Eigen::VectorXd sol = qr.solve(d.rhs);
  for (Eigen::Index k = 0; k < mfit; ++k) a[static_cast<std::size_t>(d.fitted[static_cast<std::size_t>(k)])] = sol(k) / s(k);

  // (A^T A)^-1 = P R^-1 R^-T P^T for A P = Q R, then undo the column scaling.
  const Eigen::MatrixXd R = qr.matrixR().topLeftCorner(mfit, mfit).triangularView<Eigen::Upper>();
  const Eigen::MatrixXd Rinv =
      R.triangularView<Eigen::Upper>().solve(Eigen::MatrixXd::Identity(mfit, mfit));
  const Eigen::MatrixXd Cp = Rinv * Rinv.transpose();
  const auto& P = qr.colsPermutation();
  const Eigen::MatrixXd C = P * Cp * P.transpose();
  const auto ma = static_cast<Eigen::Index>(a.size());
  covar = RowMatrixXd::Zero(ma, ma);
  for (Eigen::Index i = 0; i < mfit; ++i)
    for (Eigen::Index j = 0; j < mfit; ++j) covar(i, j) = C(i, j) / (s(i) * s(j));
  covsrtOBX(covar, mask, static_cast<int>(mfit));
  chisq = chi_square(d, y, sig, a);
  return 0;
}

}  // namespace

int covsrtOBX(RowMatrixXd& covar, std::span<const int> mask, int mfit) {
  const Eigen::Index ma = covar.rows();
  if (covar.cols() != ma || mfit < 0 || mfit > ma) return 10;
  require("covsrtOBX", "mask", mask.size(), static_cast<std::size_t>(ma));
  const RowMatrixXd packed = covar.topLeftCorner(mfit, mfit);
  std::vector<Eigen::Index> where;
  for (Eigen::Index j = 0; j < ma; ++j)
    if (mask[static_cast<std::size_t>(j)] != 0) where.push_back(j);
  if (static_cast<int>(where.size()) != mfit) return 10;
  covar.setZero();
  for (int k = 0; k < mfit; ++k)
    for (int l = 0; l < mfit; ++l) covar(where[static_cast<std::size_t>(k)], where[static_cast<std::size_t>(l)]) = packed(k, l);
  return 0;
}

int lfitdOBX(std::span<const double> x, std::span<const double> y, std::span<const double> sig, std::span<double> a,
             std::span<const int> mask, RowMatrixXd& covar, double& chisq, const BasisFunction& basis) {
  return lfit_impl("lfitdOBX", x, y, sig, a, mask, covar, chisq,
                   [&](int, double xi, std::span<double> afunc) { basis(xi, afunc); });
}

int lfit_modOBX(std::span<const double> x, std::span<const double> y, std::span<const double> sig,
                std::span<double> a, std::span<const int> mask, RowMatrixXd& covar, double& chisq,
                const IndexedBasisFunction& basis) {
  return lfit_impl("lfit_modOBX", x, y, sig, a, mask, covar, chisq, basis);
}

int svdfitOBX(std::span<const double> x, std::span<const double> y, std::span<const double> sig,
              std::span<double> a, double& chisq, const BasisFunction& basis, RowMatrixXd* covar) {
  const std::vector<int> all(a.size(), 1);
  Design d;
  if (int st = build_design("svdfitOBX", x, y, sig, a, all, [&](int, double xi, std::span<double> f) { basis(xi, f); },
                            d))
    return st;
  const Eigen::VectorXd s = equilibrate(d.A);
  Eigen::JacobiSVD<Eigen::MatrixXd> svd(d.A, Eigen::ComputeThinU | Eigen::ComputeThinV);
  svd.setThreshold(1e-5);
  const Eigen::VectorXd sol = svd.solve(d.rhs);
  for (Eigen::Index j = 0; j < sol.size(); ++j) a[static_cast<std::size_t>(j)] = s(j) > 0 ? sol(j) / s(j) : 0.0;
  if (covar) {
    const Eigen::VectorXd& w = svd.singularValues();
    const double wmax = w.size() ? w(0) : 0.0;
    Eigen::VectorXd winv2 = Eigen::VectorXd::Zero(w.size());
    for (Eigen::Index k = 0; k < w.size(); ++k)
      if (w(k) > 1e-5 * wmax) winv2(k) = 1.0 / (w(k) * w(k));
    const Eigen::MatrixXd& V = svd.matrixV();
    const Eigen::MatrixXd C = V * winv2.asDiagonal() * V.transpose();
    *covar = RowMatrixXd(C.rows(), C.cols());
    for (Eigen::Index i = 0; i < C.rows(); ++i)
      for (Eigen::Index j = 0; j < C.cols(); ++j)
        (*covar)(i, j) = (s(i) > 0 && s(j) > 0) ? C(i, j) / (s(i) * s(j)) : 0.0;
  }
  chisq = chi_square(d, y, sig, a);
  return 0;
}

int qrdcmpOBX(std::span<const double> a, int rows, int cols, QrFactors& factors) {
  if (rows < 1 || cols < 1 || rows < cols) return 10;
  require("qrdcmpOBX", "a", a.size(), static_cast<std::size_t>(rows) * static_cast<std::size_t>(cols));
  using RowMap = Eigen::Map<const Eigen::Matrix<double, Eigen::Dynamic, Eigen::Dynamic, Eigen::RowMajor>>;
  factors.qr.compute(Eigen::MatrixXd(RowMap(a.data(), rows, cols)));
  factors.rows = rows;
  factors.cols = cols;
  if (factors.qr.rank() < cols) return singular("qrdcmpOBX");
  return 0;
}

int qr_solveOBX(const QrFactors& factors, std::span<const double> b, std::span<double> x) {
  if (factors.rows < 1 || factors.cols < 1) return 10;
  require("qr_solveOBX", "b", b.size(), static_cast<std::size_t>(factors.rows));
  require("qr_solveOBX", "x", x.size(), static_cast<std::size_t>(factors.cols));
  if (factors.qr.rank() < factors.cols) return singular("qr_solveOBX");
  const Eigen::VectorXd sol = factors.qr.solve(Eigen::Map<const Eigen::VectorXd>(b.data(), factors.rows));
  for (int j = 0; j < factors.cols; ++j) x[static_cast<std::size_t>(j)] = sol(j);
  return 0;
}

}  // namespace sar::dsp

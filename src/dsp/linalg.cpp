#include "dsp/linalg.hpp"

#include <Eigen/Dense>
#include <cstdint>
#include <cstdio>
#include <limits>
#include <stdexcept>

#include "base/diagnostics.hpp"

namespace sar::dsp {
namespace {

void require(const char* what, const char* which, std::size_t have, std::int64_t need) {
  if (need >= 0 && static_cast<std::int64_t>(have) >= need) return;
  char msg[200];
  std::snprintf(msg, sizeof msg, "%s: %s holds %zu values, the dimensions need %lld", what, which, have,
                static_cast<long long>(need));
  throw std::invalid_argument(msg);
}

template <class M>
void require_bounds(const char* what, const M& m, long rows, long cols) {
  if (m.covers(1, rows, 1, cols)) return;
  char msg[200];
  std::snprintf(msg, sizeof msg, "%s: matrix rows %ld..%ld columns %ld..%ld do not cover 1..%ld x 1..%ld", what,
                m.rlo(), m.rhi(), m.clo(), m.chi(), rows, cols);
  throw std::invalid_argument(msg);
}

int singular(const char* routine) {
  char msg[120];
  std::snprintf(msg, sizeof msg, "Singular matrix in routine %s", routine);
  base::report(base::kReportError, msg);
  return 1;
}

using MatXd = Eigen::MatrixXd;
using RowMap = Eigen::Map<const Eigen::Matrix<double, Eigen::Dynamic, Eigen::Dynamic, Eigen::RowMajor>>;
using RowMapMut = Eigen::Map<Eigen::Matrix<double, Eigen::Dynamic, Eigen::Dynamic, Eigen::RowMajor>>;

// Only an exactly vanishing pivot counts as singular, as in textbook elimination; a nearly
// singular matrix is the caller's to judge.
template <class Scalar>
Scalar pivot_threshold() {
  return std::numeric_limits<Scalar>::min();
}

bool lu_singular(const MatXd& lu) {
  for (Eigen::Index i = 0; i < lu.rows(); ++i)
    if (lu(i, i) == 0.0) return true;
  return false;
}

template <class Scalar>
int gaussj_impl(NrMatrix<Scalar>& a, int n, NrMatrix<Scalar>& b, int m, const char* routine) {
  if (n < 1 || m < 0) return 10;
  require_bounds(routine, a, n, n);
  if (m > 0) require_bounds(routine, b, n, m);
  using Mat = Eigen::Matrix<Scalar, Eigen::Dynamic, Eigen::Dynamic>;
  Mat A(n, n);
  for (int i = 0; i < n; ++i)
    for (int j = 0; j < n; ++j) A(i, j) = a(i + 1, j + 1);
  Eigen::FullPivLU<Mat> lu(A);
  lu.setThreshold(pivot_threshold<Scalar>());
  if (!lu.isInvertible()) return singular(routine);
  const Mat inv = lu.inverse();
  for (int i = 0; i < n; ++i)
    for (int j = 0; j < n; ++j) a(i + 1, j + 1) = inv(i, j);
  if (m > 0) {
    Mat B(n, m);
    for (int i = 0; i < n; ++i)
      for (int j = 0; j < m; ++j) B(i, j) = b(i + 1, j + 1);
    const Mat X = lu.solve(B);
    for (int i = 0; i < n; ++i)
      for (int j = 0; j < m; ++j) b(i + 1, j + 1) = X(i, j);
  }
  return 0;
}

}  // namespace

int MmoltOBX(std::span<const double> A, std::span<const double> B, std::span<double> C, int rowsA, int colsA,
             int rowsB, int colsB) {
  if (colsA != rowsB) {
    std::fputs("\nInner matrix dimensions must agree.", stdout);
    return 10;
  }
  if (rowsA < 0 || colsA < 0 || colsB < 0) return 10;
  require("MmoltOBX", "A", A.size(), static_cast<std::int64_t>(rowsA) * colsA);
  require("MmoltOBX", "B", B.size(), static_cast<std::int64_t>(rowsB) * colsB);
  require("MmoltOBX", "C", C.size(), static_cast<std::int64_t>(rowsA) * colsB);
  Eigen::Map<const MatXd> a(A.data(), rowsA, colsA), b(B.data(), rowsB, colsB);
  Eigen::Map<MatXd> c(C.data(), rowsA, colsB);
  c.noalias() = a * b;
  return 0;
}

int ludcmpOBX(NrMatrix<double>& a, int n, NrVector<int>& indx, double& d) {
  if (n < 1) return 10;
  require_bounds("ludcmpOBX", a, n, n);
  if (!indx.covers(1, n)) throw std::invalid_argument("ludcmpOBX: indx does not cover 1..n");
  MatXd A(n, n);
  for (int i = 0; i < n; ++i)
    for (int j = 0; j < n; ++j) A(i, j) = a(i + 1, j + 1);
  Eigen::PartialPivLU<MatXd> lu(A);
  const MatXd& f = lu.matrixLU();
  if (lu_singular(f)) return singular("ludcmpOBX");
  for (int i = 0; i < n; ++i)
    for (int j = 0; j < n; ++j) a(i + 1, j + 1) = f(i, j);
  // P A = L U: row i of the factors is row p^-1(i) of A.
  const Eigen::PermutationMatrix<Eigen::Dynamic> inv = lu.permutationP().inverse();
  for (int i = 0; i < n; ++i) indx[i + 1] = inv.indices()[i] + 1;
  d = lu.permutationP().determinant();
  return 0;
}

int lubksbOBX(const NrMatrix<double>& a, int n, const NrVector<int>& indx, NrVector<double>& b) {
  if (n < 1) return 10;
  require_bounds("lubksbOBX", a, n, n);
  if (!indx.covers(1, n) || !b.covers(1, n)) throw std::invalid_argument("lubksbOBX: vectors do not cover 1..n");
  MatXd f(n, n);
  for (int i = 0; i < n; ++i)
    for (int j = 0; j < n; ++j) f(i, j) = a(i + 1, j + 1);
  Eigen::VectorXd y(n);
  for (int i = 0; i < n; ++i) {
    const int src = indx[i + 1];
    if (src < 1 || src > n) throw std::invalid_argument("lubksbOBX: indx out of 1..n");
    y(i) = b[src];
  }
  f.triangularView<Eigen::UnitLower>().solveInPlace(y);
  f.triangularView<Eigen::Upper>().solveInPlace(y);
  for (int i = 0; i < n; ++i) b[i + 1] = y(i);
  return 0;
}

int InvMatrixOBX(std::span<const double> a, std::span<double> inverse, int n) {
  if (n < 1) return 10;
  const std::int64_t nn = static_cast<std::int64_t>(n) * n;
  require("InvMatrixOBX", "a", a.size(), nn);
  require("InvMatrixOBX", "inverse", inverse.size(), nn);
  Eigen::PartialPivLU<MatXd> lu(MatXd(RowMap(a.data(), n, n)));
  if (lu_singular(lu.matrixLU())) return singular("InvMatrixOBX");
  RowMapMut(inverse.data(), n, n) = lu.inverse();
  return 0;
}

int MatInvOBX(std::span<const double> a, std::span<double> inverse, int n) {
  if (n < 1) return 10;
  const std::int64_t nn = static_cast<std::int64_t>(n) * n;
  require("MatInvOBX", "a", a.size(), nn);
  require("MatInvOBX", "inverse", inverse.size(), nn);
  NrMatrix<double> work(1, n, 1, n), none;
  for (int i = 0; i < n; ++i)
    for (int j = 0; j < n; ++j) work(i + 1, j + 1) = a[static_cast<std::size_t>(i) * n + j];
  if (int st = gaussj_impl(work, n, none, 0, "MatInvOBX")) return st;
  for (int i = 0; i < n; ++i)
    for (int j = 0; j < n; ++j) inverse[static_cast<std::size_t>(i) * n + j] = work(i + 1, j + 1);
  return 0;
}

int Transpose_MatrixOBX(std::span<const double> a, std::span<double> t, int rows, int cols) {
  if (rows < 0 || cols < 0) return 10;
  const std::int64_t nn = static_cast<std::int64_t>(rows) * cols;
  require("Transpose_MatrixOBX", "a", a.size(), nn);
  require("Transpose_MatrixOBX", "t", t.size(), nn);
  RowMapMut(t.data(), cols, rows) = RowMap(a.data(), rows, cols).transpose().eval();
  return 0;
}

int gaussjOBX(NrMatrix<double>& a, int n, NrMatrix<double>& b, int m) { return gaussj_impl(a, n, b, m, "gaussjOBX"); }

int ldgaussjOBX(NrMatrix<long double>& a, int n, NrMatrix<long double>& b, int m) {
  return gaussj_impl(a, n, b, m, "ldgaussjOBX");
}

}  // namespace sar::dsp

#pragma once
// Matrix routines of the numerical library, on Eigen.
//
// Status convention: 0 success; 1 a singular matrix (reported at level 0 through the
// diagnostics); 10 a rejected input. Span sizes that do not match the stated dimensions
// break the caller's contract and throw std::invalid_argument with both sizes.
#include <span>

#include "dsp/nrutil.hpp"

namespace sar::dsp {

/// C = A B for flat double arrays stored by columns: element (i, k) of A lies at
/// i + k * rowsA. Inner dimensions that differ print "\nInner matrix dimensions must agree."
/// and give 10.
int MmoltOBX(std::span<const double> A, std::span<const double> B, std::span<double> C, int rowsA, int colsA,
             int rowsB, int colsB);

/// LU decomposition with partial pivoting of a(1..n, 1..n), in place: the unit lower and the
/// upper factor of the row-permuted matrix. indx(1..n): indx[i] is the original row that
/// ended in row i. d: +1 or -1, the parity of the permutation. 1 for a singular matrix.
int ludcmpOBX(NrMatrix<double>& a, int n, NrVector<int>& indx, double& d);
/// Solves a x = b with the factors of ludcmpOBX; b(1..n) is replaced by x.
int lubksbOBX(const NrMatrix<double>& a, int n, const NrVector<int>& indx, NrVector<double>& b);

/// Inverse of the n x n matrix `a` (flat, either storage order: the inverse comes back in
/// the same order) through the LU factors, column by column.
int InvMatrixOBX(std::span<const double> a, std::span<double> inverse, int n);
/// The same through Gauss-Jordan elimination with full pivoting.
int MatInvOBX(std::span<const double> a, std::span<double> inverse, int n);

/// t (cols x rows) = transpose of a (rows x cols), both row-major.
int Transpose_MatrixOBX(std::span<const double> a, std::span<double> t, int rows, int cols);

/// Gauss-Jordan with full pivoting: a(1..n, 1..n) is replaced by its inverse and b(1..n,
/// 1..m) by the solutions of a x = b. 1 for a singular matrix.
int gaussjOBX(NrMatrix<double>& a, int n, NrMatrix<double>& b, int m);
/// The same in long double.
int ldgaussjOBX(NrMatrix<long double>& a, int n, NrMatrix<long double>& b, int m);

}  // namespace sar::dsp

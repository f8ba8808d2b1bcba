#pragma once
// Least-squares fitting of linear models, on Eigen.
//
// The models are sum_j a[j] f_j(x) with basis functions given by the caller. The fits solve the
// weighted design matrix (rows f_j(x_i)/sig_i, columns scaled to unit norm) by column-pivoted
// Householder QR or by SVD, never through normal equations: polynomial bases in abscissae of
// thousands of samples up to the fourth power have condition numbers whose square would eat
// all of double precision. Covariances come from the triangular factor.
//
// Indices are 0-based. Status: 0 success; 1 a singular (rank-deficient) system, reported at
// level 0; 10 a rejected input: a zero sig, no term to fit. Spans whose sizes do not match
// throw std::invalid_argument with both sizes.
#include <Eigen/Core>
#include <Eigen/QR>
#include <functional>
#include <span>

namespace sar::dsp {

/// Row-major dense matrix, as our data are lines x samples.
using RowMatrixXd = Eigen::Matrix<double, Eigen::Dynamic, Eigen::Dynamic, Eigen::RowMajor>;

/// Fills afunc[j] = f_j(x) for the ma basis functions.
using BasisFunction = std::function<void(double x, std::span<double> afunc)>;
/// The same, also told the index of the point (for models whose basis needs more than x).
using IndexedBasisFunction = std::function<void(int index, double x, std::span<double> afunc)>;

/// Weighted linear least squares. Point i has weight 1/sig[i]^2. Terms with mask[j] == 0 keep
/// a[j] and are subtracted from the ordinate first; the others are fitted. covar (ma x ma)
/// receives the covariance of the fitted terms in the masked layout (zero rows and columns
/// for held terms); chisq the weighted sum of squared residuals.
int lfitdOBX(std::span<const double> x, std::span<const double> y, std::span<const double> sig, std::span<double> a,
             std::span<const int> mask, RowMatrixXd& covar, double& chisq, const BasisFunction& basis);

/// lfitdOBX with a basis that is also given the point index.
int lfit_modOBX(std::span<const double> x, std::span<const double> y, std::span<const double> sig,
                std::span<double> a, std::span<const int> mask, RowMatrixXd& covar, double& chisq,
                const IndexedBasisFunction& basis);

/// Spreads the mfit x mfit covariance of the fitted terms (top-left of covar) to the ma x ma
/// layout given by the mask, with zeros for held terms.
int covsrtOBX(RowMatrixXd& covar, std::span<const int> mask, int mfit);

/// Least squares through the singular value decomposition of the weighted design matrix,
/// singular values below 1e-5 of the largest set to zero (a rank-deficient model gives the
/// minimum-norm solution instead of an error). covar, when given, receives the covariance.
int svdfitOBX(std::span<const double> x, std::span<const double> y, std::span<const double> sig,
              std::span<double> a, double& chisq, const BasisFunction& basis, RowMatrixXd* covar = nullptr);

/// QR factors of a rows x cols matrix (rows >= cols), column-pivoted.
struct QrFactors {
  Eigen::ColPivHouseholderQR<Eigen::MatrixXd> qr;
  int rows = 0;
  int cols = 0;
};

/// Factors the row-major rows x cols matrix a. 1 when its rank is below cols.
int qrdcmpOBX(std::span<const double> a, int rows, int cols, QrFactors& factors);
/// The least-squares solution x (cols) of a x = b (rows). 1 for a rank-deficient factor.
int qr_solveOBX(const QrFactors& factors, std::span<const double> b, std::span<double> x);

}  // namespace sar::dsp

#pragma once
// Doppler centroid estimation of a range-compressed image: block statistics, the ambiguous
// centroid polynomial, the PRF ambiguity (wavelength diversity, multi-look beat frequency or
// orbit geometry) and the account of the run in "DCEST_resume.txt".
//
// Statuses: 0 success; 10 a rejected input; 1 not enough memory allowed (setprocbuf) or an
// unresolved ambiguity (estambiguity, not an error); 2 a file that cannot be read or written;
// -1 a numerical failure of the estimation (no block to fill from, an integral that does not
// converge).
#include <cmath>
#include <cstdint>
#include <span>
#include <string>
#include <vector>

#include "doppler/dcestconf.hpp"

namespace sar::doppler {

/// The image the estimator works on. The range-compressed file holds `lines` rows of `samples`
/// fcomplex in the machine's byte order, with no header (or, in core mode, the matrix given in
/// dcestconf::coreMatrix). The time origins become a7 and a8 of the polynomial.
struct dcimage {
  std::string path;
  int32_t samples = 0;
  int32_t lines = 0;
  double prf = 0.0;
  double platformSpeed = 0.0;      ///< m/s
  double rangeTimeOrigin = 0.0;    ///< two-way range time of sample 0, s
  double azimuthTimeOrigin = 0.0;  ///< time of line 0, s
};

/// Value of the polynomial at range time r and azimuth time t.
double dceval(const DopplerPoly& a, double r, double t);

/// Cubic B-spline kernel modelling the antenna's azimuth autocorrelation.
double bspline3(double x);

// ---------------------------------------------------------------- entry and block statistics
/// The whole estimation: block statistics, polynomial, ambiguity, result file. Reads the
/// configuration fields of `conf`, conf.carrier, conf.fs, conf.geometricCentroid,
/// conf.outputDir and (in core mode) conf.coreMatrix; writes `poly` (a0..a6 in Hz and Hz per
/// second powers, a7 and a8 from the image's time origins) and the results in `conf`. The
/// image's line count becomes the lines used (whole block rows).
int getnadcpoly(dcimage& image, dcestconf& conf, DopplerPoly& poly);
/// Grid, patch maps and sizes; 10 for inconsistent block or patch sizes or an image smaller
/// than one block, 1 when `Memory` holds less than one block row.
int setprocbuf(dcestconf& conf, dcimage& image);
/// Statistics of every grid block and the patch maps, then the contrast map.
int getnadcbins(dcestconf& conf, const dcimage& image);
/// Smoothed contrast of the patch maps, in conf.contrastMap.
int getcontrast(dcestconf& conf);
/// Statistics of one block (`Blockl` rows of `Blocks` samples, non-finite samples counted as
/// zero) into `out`; r0/r1 of conf give the noise. The centre is left to the caller.
void blockstats(const dcestconf& conf, std::span<const fcomplex> block, dcblock& out);

// ---------------------------------------------------------------- ambiguous polynomial
/// Rating, filling, plane search, fit, ambiguity and conversion to Hz.
int dcnapoly(const dcimage& image, dcestconf& conf, DopplerPoly& poly);
/// SNR of every block against the mean noise of the valid ones; good = valid with SNR above 0.
int ratesnr(dcestconf& conf);
/// Bad blocks take the phasor mean of the good blocks in growing windows around them (marked
/// filled; they do not enter the fit); -1 when no good block exists.
int fillblocks(dcestconf& conf, const dcimage& image);
int getkrstd(const dcimage& image, dcestconf& conf);
int unwrapdcbin(dcestconf& conf, std::array<double, 3>& plane);
/// Fits the seven terms (cycles, sample and line units) into coef[0..6]; 10 with fewer than
/// 8 good blocks.
int getdccoef(dcestconf& conf, const std::array<double, 3>& plane, std::span<double> coef);
/// Polynomial in cycles of the PRF with sample and line indices as variables (coef[0..6]).
double dccycles(std::span<const double> coef, double sample, double line);

// ---------------------------------------------------------------- ambiguity
/// Sets conf.ambiguity and conf.decision. 0 resolved (by configuration or by an estimator),
/// 1 unresolved (the field then holds the geometric fallback), 10 a bad `Amb_flag` or no
/// MLBF block wanted. `coef` is the polynomial in cycles (dccycles layout).
int estambiguity(dcestconf& conf, const dcimage& image, std::span<const double> coef);
/// MLBF on conf.mlbfBlocks, then WDAR on conf.wdarBlocks. The blocks of each estimator are
/// spread over the OpenMP threads; the results and the messages, printed in block order, do
/// not depend on the thread count.
int bestblocksproc(dcestconf& conf, const dcimage& image, std::span<const double> coef);
int dcnastd(dcestconf& conf);
/// Trimmed mean, standard deviation and count of `values` (loop of growing trims).
ambstats trimmed_stats(std::span<const double> values, double varthr);
/// An estimator's answer counts when its trimmed spread is below `varthr` and the trimmed set
/// still holds at least a quarter of its values (and two).
bool agreeing(const ambstats& s, double varthr);
int getpercentile(std::span<const double> values, double trim, double& low, double& high);
/// Histogram of `bins` bins between the minimum and the maximum; a constant input puts every
/// value in bin 0 with a step of 0.
int make_hist(std::span<const double> values, double& step, double& minimum, int bins, std::vector<int>& counts);
/// Up to N map cells (x, y) of highest positive value whose blocks (bw x bh cells centred on
/// them) lie inside the map and do not overlap. Returns the count found.
int topNpoints(std::span<const float> map, int width, int height, int N, int bw, int bh,
               std::vector<std::array<int, 2>>& points);
/// Marks with x = -1 the points (from index `first` on) whose block leaves the map or overlaps
/// the block of a kept point before it; returns the count kept among them.
int sel_no_overlap(std::vector<std::array<int, 2>>& points, std::size_t first, int width, int height, int bw, int bh);
/// Reads the block with top-left corner (firstLine, firstSample) into `block` (Blockl x
/// Blocks); non-finite samples become 0. 10 for a block outside the image, 2 for a file error.
int read_block(const dcestconf& conf, const dcimage& image, int firstLine, int firstSample,
               std::vector<fcomplex>& block);

/// Range frequency bins used by WDAR: signed index k with |k| <= RgBand Blocks / 2.
std::vector<char> wdar_bins(int blocks, double rgBand);
int wdar_init(dcestconf& conf);
/// Absolute centroid of one block in PRF; -1 without wdar_init, 10 for a short block. Blocks
/// may be run concurrently.
int wdar_estimate(const dcestconf& conf, std::span<const fcomplex> block, double centreCycles, double& estimate);
void wdar_free(dcestconf& conf);
int multimlbf_init(dcestconf& conf);
int cirpZ_init(dcestconf& conf);
/// Beat frequency estimates of MLBF block `index` from `block`; 1 without the inits, 10 for a
/// bad index or a short block. The progress messages go to `log` when given (stdout
/// otherwise). Blocks may be run concurrently: each writes only its own record.
int multimlbf(dcestconf& conf, std::span<const fcomplex> block, int index, std::string* log = nullptr);
void mlbf_free(dcestconf& conf);

// ---------------------------------------------------------------- result file
int infodump(const dcestconf& conf, const dcimage& image, const DopplerPoly& poly, const char* name);
int resumefile(const dcestconf& conf, const dcimage& image, const DopplerPoly& poly, const std::string& path);

/// Rounding half away from zero; 0 for NaN, clamped to the int range.
inline int round_half_away(double x) {
  if (!(x == x)) return 0;
  const double r = x >= 0.0 ? std::floor(x + 0.5) : std::ceil(x - 0.5);
  if (r >= 2147483647.0) return 2147483647;
  if (r <= -2147483648.0) return -2147483647 - 1;
  return static_cast<int>(r);
}

}  // namespace sar::doppler

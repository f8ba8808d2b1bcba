#pragma once
// Wavenumber-domain (omega-K) focusing of one block of range-compressed lines.
//
// Conventions. A block is `lines` rows of `samples` complex samples (row pitch = samples); row
// l is azimuth time l / PRF, sample i is two-way range time nearTime + i / fs. Wavenumbers are
// radians per metre of slant range: kr = 4 pi f / c over the radar band, ky = 2 pi f_D / V,
// kx^2 = kr^2 - ky^2. A point at closest range R and azimuth position x has, after range
// compression, the 2-D spectrum exp(-j sqrt(kr^2 - ky^2) R - j ky x): the kernels multiply by
// the conjugate for the reference range R0 and map or correct the rest.
//
// Three kernels, chosen by the interpolation order n (`PerformInterpolation`):
//   n = 0   FastWK         reference function only; the differential migration is a per
//                          Doppler range phase ramp (exact enough for narrow squints and
//                          blocks a few thousand samples wide)
//   n = 1   ChirpInterpWK  Stolt mapping by a chirp-Z zoom of each Doppler line onto a grid
//                          aligned with its migration, then a two-point interpolator
//   n >= 2  LSInterpWK     Stolt mapping by a bank of least-squares interpolators of 2n+1 taps
// Every kernel works in place on `data`; lines are independent once the azimuth transform is
// done, so the per-line work runs in parallel with results independent of the thread count.
#include <complex>
#include <cstdint>
#include <span>
#include <vector>

#include "dsp/fft.hpp"
#include "base/constants.hpp"

namespace sar::stripmap {

using fcomplex = std::complex<float>;

inline constexpr double kC = base::kSpeedOfLight;
inline constexpr double kHalfC = 149896229.0;
inline constexpr double kQuarterC = 74948114.5;
inline constexpr double kTwoOverC = 6.671281903963041e-09;
inline constexpr double kFourPiOverC = 4.191690043903363e-08;
inline constexpr double kPi = base::kPi;

/// Parameters of one block.
struct wkparm {
  int32_t progressFlag = 0;
  int32_t lines = 0;
  int32_t samples = 0;
  double carrier = 0.0;  // f0, Hz
  double fs = 0.0;       // range sampling rate, Hz
  double fd = 0.0;       // Doppler centroid of this block, Hz
  // Centroid at the block's first and last sample, Hz; both 0: fd across the block.
  double fdNear = 0.0, fdFar = 0.0;
  double rangePadding = 1.0;
  double azimuthShift = 0.0;  // s
  double rangeShift = 0.0;    // s
  int32_t phaseControl = 0;
  double prf = 0.0;
  std::array<double, 3> rate{};  // Doppler rate: constant, linear and quadratic in range time
  double nearTime = 0.0;         // range time of sample 0
  double rateReference = 0.0;    // reference range time of the rate polynomial
  double AntennaLength = 0.0;
  double azimuthWindowH = 0.0;
  double rangeWindowH = 0.0;
  double azimuthLookBandwidth = 0.0;  // Hz
  double rangeLookBandwidth = 0.0;    // Hz
  double azimuthTransitionBandwidth = 0.0;
  double rangeTransitionBandwidth = 0.0;
  int32_t WhiteningFlag = 0;
  int32_t transformSign = 0;  // only 0 is supported
  std::span<fcomplex> data;   // lines x samples, rows `pitch` samples apart
  // Samples between the starts of two rows of `data` (0: `samples`). A pitch of a multiple of
  // 4 KiB puts a column's samples in one cache set; the sub-blocks are padded past it.
  int32_t pitch = 0;
  // multirg only: where the sub-blocks are read from (lines x samples; null: `data`), and the
  // lines of the block whose focused samples are written back into `data`, from its first
  // line on (keepLines < 0: every line, in place).
  const fcomplex* input = nullptr;
  int32_t keepFirst = 0;
  int32_t keepLines = -1;
  // multirg only: lines of the input that hold data (< 0: all `lines`); the lines after them
  // are zeros that pad the block to a transform length of small prime factors.
  int32_t inputLines = -1;
  // The range sub-block work matrix: made once for the stage, reused by every block.
  dsp::cvector subBlock;
  double R0 = 0.0;            // reference range, m
  double V = 0.0;             // equivalent velocity, m/s
  int32_t PerformInterpolation = 0;
  double StoltPadding = 0.0;
  double spectrumCentreFd = 0.0;  // Hz; 0: the block's own centroid
  double chirpBandwidth = 0.0;    // Hz
  int32_t finalShift = 0;
};

/// Squint of the block's centroid for the block's V: asin(lambda fd / (2 V)).
double block_squint(const wkparm& wk);

/// Equivalent velocity and reference range from the change of the Doppler rate across the
/// block. Returns 0; 1 when the rate does not change or gives no real velocity.
int MyComputeEqPar(wkparm& wk);
void WKCentre(const wkparm& wk, double& kr0, double& ky0, double& kx0);
/// Mapped grid: M (transform length), output spacing, interpolation length and output samples.
/// Returns 1 at the geometric limit of the squint.
int OutImagePar(const wkparm& wk, int& M, double& spacing, double& Ni, int& Nout);
/// Per Doppler bin (FFT order): ky, ky squared and the bulk migration kr0 - sqrt(kx0^2 + ky^2),
/// the bins wrapped inside one PRF centred on the block's centroid.
void KyAxis(const wkparm& wk, std::vector<double>& ky, std::vector<double>& ky2, std::vector<double>& rs);
/// output[i] = input[i] exp(j k (i step + x0)) / norm for i < n, zeros up to nOut. In place when
/// input and output are the same.
void RngShift(const fcomplex* input, int n, double step, double k, fcomplex* output, int nOut, double x0, double norm);

int FastWK(wkparm& wk, std::span<const double> ky, std::span<const double> ky2, std::span<const double> rs, double sa,
           double sr);
int ChirpInterpWK(wkparm& wk, double Ni, int M, int Nout, std::span<const double> ky, std::span<const double> ky2,
                  std::span<const double> rs, double spacing, double sa, double sr);
int LSInterpWK(wkparm& wk, double Ni, int M, int Nout, std::span<const double> ky, std::span<const double> ky2,
               double spacing, double sa, double sr);

}  // namespace sar::stripmap

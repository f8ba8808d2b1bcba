#pragma once
// Image resampling: enlargement of a matrix along one dimension (spectral zero padding or
// straight lines), reading a complex image at fractional coordinates with a separable
// least-squares filter bank, and the two-dimensional phase ramp removed before such a reading
// and put back after it.
//
// Matrices are row-major. Status: 0 success; 1 when both dimensions would change (one call
// resamples one dimension); 10 a rejected input (sizes below 1, a smaller output, an even bank
// size). A buffer shorter than its stated dimensions throws std::invalid_argument.
#include <span>
#include <vector>

#include "dsp/complex.hpp"
#include "dsp/fft.hpp"

namespace sar::dsp {

/// Enlarges a matrix of n rows by m columns to n2 by m2, with n2 == n or m2 == m.
class interp {
 public:
  /// Plans for a matrix of nIn rows of mIn samples to nOut rows of mOut samples.
  int setplans(int nIn, int mIn, int nOut, int mOut);
  int destroyplans();
  /// Band-limited enlargement by zero padding of the spectrum. `data` (nIn x mIn) is
  /// transformed in place and left as its spectrum; output is nOut x mOut. Samples keep their
  /// amplitude; an even length splits its Nyquist bin into two halves.
  int interpft(std::span<fcomplex> data, int nIn, int mIn, int nOut, int mOut, std::span<fcomplex> output);
  /// interpft with the sizes and plans of the last setplans.
  int interpft_p(std::span<fcomplex> data, std::span<fcomplex> output);
  /// Straight lines between samples: with f = out/in (integer division), sample i goes to f i
  /// and the f - 1 after it are a[i] + (a[i+1] - a[i]) k / f; behind the last sample its
  /// value is repeated.
  int interp_lin(std::span<const fcomplex> data, int nIn, int mIn, int nOut, int mOut, std::span<fcomplex> output);
  int interp_lin(std::span<const float> data, int nIn, int mIn, int nOut, int mOut, std::span<float> output);
  int interp_lin(std::span<const double> data, int nIn, int mIn, int nOut, int mOut, std::span<double> output);

 private:
  fft_plan forward_;
  fft_plan backward_;
  int nIn_ = 0, mIn_ = 0, nOut_ = 0, mOut_ = 0;
  bool planned_ = false;
};

/// Reads an image of n samples a row (x) by m rows (y) at fractional coordinates with a
/// separable bank of P interpolators of N taps for a band of width B (cycles per sample).
/// The band may be centred off zero in each dimension (setCentre); after demodulation it is 0.
class interp2D {
 public:
  /// P odd (row P/2 interpolates at the sample itself), N odd, 0 < B <= 1.
  interp2D(int P = 101, int N = 9, double B = 0.8) : P_(P), N_(N), B_(B) {}
  /// Band centres in cycles per sample along x (within a row) and y (across rows).
  void setCentre(double fx, double fy);

  /// Fixed step: point (i, j) is (x0 + i dx, y0 + j dy), output row-major, `down` rows of
  /// `across` points. Mode 0: least-squares bank of N taps; mode 1: three-tap quadratic.
  int interp2(int n, int m, std::span<const fcomplex> data, double x0, double y0, double dx, double dy, int across,
              int down, std::span<fcomplex> output);
  int interp2(int n, int m, std::span<const fcomplex> data, double x0, double y0, double dx, double dy, int across,
              int down, std::span<fcomplex> output, int mode);
  /// Explicit coordinates: point (i, j) is (xs[i], ys[j]).
  int interp2(int n, int m, std::span<const fcomplex> data, std::span<const double> xs, std::span<const double> ys,
              int across, int down, std::span<fcomplex> output);
  int interp2(int n, int m, std::span<const fcomplex> data, std::span<const double> xs, std::span<const double> ys,
              int across, int down, std::span<fcomplex> output, int mode);

  /// Builds the bank of a mode (interp2 does it on first use); 10 for a bad mode or size.
  int prepare(int mode);
  /// One point with the bank last prepared; 0 outside the image.
  fcomplex at(int n, int m, std::span<const fcomplex> data, double x, double y) const;

  int P() const { return P_; }
  int N() const { return taps_; }

 private:
  int P_, N_;
  double B_;
  double fx_ = 0.0, fy_ = 0.0;
  int mode_ = -1;
  int taps_ = 0;
  std::vector<fcomplex> range_;    ///< P x taps, along x
  std::vector<fcomplex> azimuth_;  ///< P x taps, along y
};

/// Two-dimensional phase ramp phi = -2 pi ((y c3 + c2) x + (x c1 + c0) y), x the line, y the
/// sample.
struct demodulationPhase {
  double c0 = 0.0, c1 = 0.0, c2 = 0.0, c3 = 0.0;
  double phase(double line, double sample) const;
  /// value *= exp(j phi).
  int applyDemodPhase(double line, double sample, fcomplex& value) const;
  /// value *= exp(-j phi).
  int applyModPhase(double line, double sample, fcomplex& value) const;
};

}  // namespace sar::dsp

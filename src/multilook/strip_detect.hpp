#pragma once
// Detection of a stripmap SLC into looks: the arithmetic of the multilooker, without files.
//
// A range line is oversampled by two before detection (the detected spectrum is twice as wide
// as the complex one, so detecting at the SLC's own rate would fold it), on a grid shifted by a
// quarter of an input sample: oversampled cell j sits at input position j/2 - 1/4. The 2 F
// cells of look m then centre on input position m F + (F - 1)/2, the centre of the F input
// samples the look stands for, for even and odd F alike.
//
// In azimuth the F rows of a look are summed in power as they are. Oversampling a block of F
// rows by periodic interpolation, then summing the block, gives the same sum (Parseval), so it
// would cost transforms and change nothing.
//
// The transform keeps the folding bin of an even length whole on one side: split in two halves
// it would turn into a cosine whose power on the oversampled grid is half its own, and white
// clutter would lose 1/(2 N) of its power.
#include <complex>
#include <cstdint>
#include <span>
#include <vector>

#include "dsp/fft.hpp"

namespace sar::multilook {

using fcomplex = std::complex<float>;

/// Cells of an output that covers `n` inputs by looks of `f`: a partial look at the end counts.
int looked_size(int n, int f);

/// Range oversampling and detection of one line into its looks.
class RangeLookDetector {
 public:
  /// `samples` input samples a line, `looks` of them a look (both at least 1).
  RangeLookDetector(int samples, int looks);

  int samples() const { return samples_; }
  int looks() const { return looks_; }
  int output_samples() const { return static_cast<int>(cells_.size()); }
  /// Oversampled cells summed into each output sample (2 looks, fewer in a partial last look).
  std::span<const int> cells() const { return cells_; }

  /// Adds the oversampled power of `line` (samples() values) over each look to `sum`
  /// (output_samples() values).
  void add_line(std::span<const fcomplex> line, std::span<double> sum);

  /// The oversampled line of the last add_line (2 samples() values), for checks.
  std::span<const fcomplex> oversampled() const { return {wide_.data(), 2 * static_cast<std::size_t>(samples_)}; }

 private:
  int samples_;
  int looks_;
  int n_;  // transform length of an input line
  std::vector<int> cells_;
  std::vector<fcomplex> shift_;  // quarter-sample phase and 1/N, per bin of the narrow spectrum
  dsp::fft_plan forward_;
  dsp::fft_plan backward_;
  dsp::cvector narrow_;
  dsp::cvector wide_;
};

/// Mean power of a look into amplitude: sqrt(sum / (rows x cells)); 0 where nothing was summed.
float look_amplitude(double sum, int rows, int cells);

/// Complex presum of a block of `rows` rows (row-major, `samples` each) by `rangeLooks`: the
/// mean of each rows x rangeLooks cell, added to nothing, written to `out` (samples / looks,
/// truncated, values).
void presum_block(std::span<const fcomplex> block, int rows, int samples, int rangeLooks, std::span<fcomplex> out);

}  // namespace sar::multilook

#pragma once
// Impulse response measurement of point targets.
//
// A response is measured on its band-limited interpolant: a window of samples around the peak
// is transformed, its spectrum is turned so that the power centroid sits at frequency 0 (the
// Doppler centroid of an azimuth response may put the band across the folding frequency, where
// zero padding would cut it in two), padded with zeros opposite the centroid and transformed
// back, which oversamples the window. Positions that matter (peak, -3 dB points, nulls, highest
// sidelobe) are then refined on the same interpolant evaluated directly, so they do not depend
// on the oversampled grid.
//
// Definitions, per cut:
//   resolution  width between the two -3 dB (half power) points, in samples;
//   mainlobe    from the first minimum of the power before the peak to the first after it;
//   PSLR        highest power in the sidelobe region relative to the peak power, dB;
//   ISLR        power integrated over the sidelobe region relative to the power integrated
//               over the mainlobe, dB;
//   sidelobe region  from peak - span to the first null and from the other null to
//               peak + span, span = islr_span resolutions (10 by default), shortened when the
//               data end first (then span_truncated is set).
// The window of a cut grows (up to max_cut_length) until it holds the whole sidelobe region.
#include <complex>
#include <cstdint>
#include <limits>
#include <span>
#include <string>
#include <vector>

namespace sar::analyser {

using fcomplex = std::complex<float>;

inline constexpr double kNaN = std::numeric_limits<double>::quiet_NaN();

struct AnalyserOptions {
  int oversample = 16;        ///< zero-padding factor of the FFT oversampling, at least 2
  int search_radius = 8;      ///< the peak is sought within this many samples of the expected position
  int neighbourhood = 32;     ///< side of the 2-D neighbourhood oversampled to find a target's peak
  int interp_window = 64;     ///< samples across a cut that interpolate it to the peak's fraction
  int cut_length = 128;       ///< first window of a cut
  int max_cut_length = 1024;  ///< a cut's window grows up to this for the sidelobe region
  double islr_span = 10.0;    ///< half width of the sidelobe region, in resolutions
  bool keep_curves = false;   ///< keep the oversampled cuts and patch (for plots)
};

/// Measurement of one cut. Positions are fractional sample indices of the cut (of the image,
/// for the cuts of a point measurement).
struct Irf1D {
  bool valid = false;
  std::string problem;  ///< why the cut is not valid
  double peak = kNaN;
  double amplitude = kNaN;
  double phase_rad = kNaN;  ///< phase of the sample at the peak, (-pi, pi]
  double resolution = kNaN;  ///< -3 dB width, samples
  double half_power_before = kNaN, half_power_after = kNaN;
  double null_before = kNaN, null_after = kNaN;
  double pslr_db = kNaN;
  double islr_db = kNaN;
  double sidelobe_at = kNaN;   ///< position of the highest sidelobe
  double region_first = kNaN, region_last = kNaN;  ///< ends of the sidelobe region
  bool span_truncated = false;  ///< the data ended before islr_span resolutions
  /// Spectral power centroid removed before padding, cycles a sample in [-0.5, 0.5); 0 when the
  /// spectrum is too flat for a centroid to mean anything (resultant below 5 % of the power).
  double centroid = 0.0;
  int window_first = 0;   ///< first sample of the analysed window
  int window_length = 0;
  int oversample = 0;
  /// With keep_curves: power of the oversampled window in dB relative to the peak, from
  /// curve_first in steps of 1 / oversample.
  std::vector<float> curve_db;
  double curve_first = 0.0;
};

/// Measurement of a point target in an image.
struct IrfMeasure {
  bool valid = false;
  std::string problem;
  double expected_line = kNaN, expected_sample = kNaN;
  double peak_line = kNaN, peak_sample = kNaN;
  double res_az_px = kNaN, res_rg_px = kNaN;
  double pslr_az_db = kNaN, pslr_rg_db = kNaN;
  double islr_az_db = kNaN, islr_rg_db = kNaN;
  double phase_rad = kNaN;
  double amplitude = kNaN;
  double centroid_az = 0.0, centroid_rg = 0.0;  ///< spectral centroids, cycles a sample
  Irf1D azimuth;  ///< cut along the lines through the peak (positions are lines)
  Irf1D range;    ///< cut along the samples through the peak (positions are samples)
  /// With keep_curves: the oversampled 2-D neighbourhood in dB relative to the peak, row-major,
  /// its first point at (patch_first_line, patch_first_sample), steps 1 / oversample.
  std::vector<float> patch_db;
  int patch_lines = 0, patch_samples = 0;
  double patch_first_line = 0.0, patch_first_sample = 0.0;
};

/// A window on a row-major complex image: `lines` rows of `samples`, rows `stride` apart.
/// (first_line, first_sample) is the position of its first sample in the whole image; every
/// position a measurement takes or returns is in whole-image coordinates.
struct ComplexImageView {
  std::span<const fcomplex> data;
  int lines = 0;
  int samples = 0;
  std::int64_t stride = 0;
  int first_line = 0;
  int first_sample = 0;

  const fcomplex& at(int line, int sample) const {
    return data[static_cast<std::size_t>(line * stride + sample)];
  }
  /// Sizes agree with the data.
  bool consistent() const;
};

/// Measures the response whose peak lies within search_radius of `expected_index`.
Irf1D measure_cut(std::span<const fcomplex> cut, double expected_index, const AnalyserOptions& options);
Irf1D measure_cut(std::span<const fcomplex> cut, double expected_index, int oversample);

/// Finds the peak near the expected position, oversamples the 2-D neighbourhood to place it,
/// then takes the azimuth and range cuts through it (each interpolated to the other
/// coordinate's fraction) and measures them. The cuts are taken again at each new estimate
/// until the peak stops moving.
IrfMeasure measure_point(const ComplexImageView& image, double expected_line, double expected_sample,
                         const AnalyserOptions& options);

}  // namespace sar::analyser

#pragma once
// Quick-look GeoTIFF: an 8-bit amplitude rendering of a complex image, reduced by averaging
// power over blocks, scaled robustly (the median amplitude sets the grey level), and tied to
// the ground by the geographic coordinates of the image corners (WGS84).
#include <array>
#include <complex>
#include <cstdint>
#include <functional>
#include <span>
#include <string>
#include <vector>

namespace sar::hostlib {

/// Geographic position of an image corner, degrees.
struct GeoCorner {
  double latitude = 0.0;
  double longitude = 0.0;
};

struct QuickLookRequest {
  int maxWidth = 1024;        // output fits in maxWidth x maxHeight, aspect kept
  int maxHeight = 1024;
  double scale = 1.0;         // brightness factor: grey = scale * amplitude / median * maxValue / 4
  double rangeSpacing = 1.0;  // metres per input sample, for the aspect ratio
  double azimuthSpacing = 1.0;  // metres per input line
  int maxValue = 254;         // brightest grey; 0 is kept for "no data"
  /// Corners in the order near-early, far-early, near-late, far-late (first line first
  /// sample, first line last sample, last line first sample, last line last sample).
  std::array<GeoCorner, 4> corners{};
  bool georeferenced = true;
};

/// Reads input line `line` (0-based) into `row` (samples values); false on failure.
using ComplexRowSource = std::function<bool(int line, std::span<std::complex<float>> row)>;

struct QuickLookResult {
  int width = 0;
  int height = 0;
  double medianAmplitude = 0.0;
};

/// Render `lines` x `samples` complex samples to `outPath`. Returns 0, or 10 when the input
/// cannot be read or the file cannot be written (nothing is left behind then).
int write_quicklook_geotiff(const std::string& outPath, int lines, int samples, const ComplexRowSource& source,
                            const QuickLookRequest& request, QuickLookResult* result = nullptr);

/// The power sums of a quick-look, before it is scaled and written: small beside the image, so
/// an image held in memory can be summed before it is released and the quick-look written
/// later without reading the image back.
struct QuickLookGrid {
  int lines = 0, samples = 0, width = 0, height = 0;
  std::vector<double> power;     // width x height sums of |z|^2
  std::vector<uint32_t> counts;  // samples in each sum
  std::vector<int> column;       // output column of each input sample
  /// Empty sums for an image of lines x samples under `request`. Returns 0; 10 for an empty
  /// image or request.
  int start(int lines, int samples, const QuickLookRequest& request);
};

/// Adds `count` lines of a started grid's image, from line `first` on (lines of `pitch`
/// samples), to its sums. Runs of lines added in order give the sums of the whole image.
void quicklook_add(QuickLookGrid& grid, int first, int count, const std::complex<float>* lines, std::int64_t pitch);

/// Scales the grid's mean amplitudes and writes them as write_quicklook_geotiff does (the
/// request's scale, grey levels and corners; its size is the grid's). Returns 0; 10 when the
/// grid is empty or the file cannot be written.
int write_quicklook_grid(const std::string& outPath, const QuickLookGrid& grid, const QuickLookRequest& request,
                         QuickLookResult* result = nullptr);

/// Output size for an input of `lines` x `samples` under `request` (each at least 1).
std::array<int, 2> quicklook_size(int lines, int samples, const QuickLookRequest& request);

}  // namespace sar::hostlib

#pragma once
// Multilooked images of a focused stripmap SLC.
//
// Input: the SLC raster, read through its raster header "<slc>.hdr", and its annotation
// "<slc>_hdr" (profile text) for the grid: first line time, line step, near slant time,
// sampling rate, pixel spacings, suggested looks, state vectors.
//
// Detected (the default): Fa rows by Fr samples a look, range oversampled by two before
// detection, mean power of the look written as amplitude (float). Coherent: the complex mean of
// each look (complex float). Sizes: a partial look at the end of a line or of the image is kept
// and averaged over what it holds (detected), or dropped (coherent).
//
// The output grid starts at the centre of the first look, (F - 1)/2 input cells after the input's
// first line and sample, with steps F times the input's; a point at input position p lands at
// output position (p - (F - 1)/2) / F.
//
// Ground range: each multilooked line is resampled in power (windowed sinc) onto a grid of equal steps on the
// ellipsoid, from the distances of the slant cells' zero-Doppler ground points at the scene's
// centre time (Earth-fixed chords between neighbours, summed).
//
// Output files, for output raster R: R (written as "R.part" and renamed when whole), R.hdr and
// the GDAL sidecar R.vrt, and the annotation R_hdr (the SLC's, with the multilooked grid; in
// ground range also Processing.GroundRangeSlantTimeCoeff, the slant time of each column).
// Returns 0; 10 for a rejected request (look factors below 1, an input that is not complex, an
// annotation without the grid); 1 for a failed read or write. Nothing named R is left behind
// by a failure.
#include <array>
#include <string>
#include <vector>

namespace sar::multilook {

/// What the SLC annotation says about the image grid.
struct SlcGrid {
  double firstLineTime = 0.0;    ///< sec85 of the first line
  double lineStep = 0.0;         ///< s between lines
  double nearTime = 0.0;         ///< two-way slant time of the first sample, s
  double samplingRate = 0.0;     ///< Hz
  double pixelSpacingRg = 0.0;   ///< m, slant
  double pixelSpacingAz = 0.0;   ///< m
  double carrierFrequency = 0.0; ///< Hz
  int suggestedAzimuthLooks = 1;
  int suggestedRangeLooks = 1;
  bool hasOrbit = false;
  std::array<double, 15> positions{};   ///< five state vectors, Earth-fixed m
  std::array<double, 15> velocities{};  ///< m/s
  double orbitFirstTime = 0.0;          ///< sec85
  double orbitStep = 0.0;               ///< s
};

/// Reads the grid from an annotation "<slc>_hdr". 0, or 10 with `error` naming the missing key.
int read_slc_grid(const std::string& annotation, SlcGrid& grid, std::string& error);

/// Ground distance (m) of each of `samples` slant cells, starting at two-way time `nearTime`
/// with steps `timeStep`, from the first cell, at azimuth time `azimuthTime`. 0, or the
/// geolocation's status.
int ground_distances(const SlcGrid& grid, double azimuthTime, double nearTime, double timeStep, int samples,
                     std::vector<double>& distance);

/// Fractional slant cell of each ground cell g x step (g = 0 .. while inside the slant extent),
/// from increasing `distance`. Empty when the distances do not increase.
std::vector<double> ground_to_slant(const std::vector<double>& distance, double step);

/// Resamples a line of power at the fractional cells `where` (12 cells of Hann-windowed sinc
/// around each, normalised to sum to one), written as amplitude.
void resample_power(const std::vector<double>& power, const std::vector<double>& where, std::vector<float>& amplitude);

/// The two-way slant time of ground column j as a polynomial sum_k c_k j^k (degree 4), fitted
/// to the ground cells' fractional slant cells `where` of a slant grid (nearTime, slantStep).
/// `worst` receives the largest misfit in seconds.
std::array<double, 5> fit_ground_columns(const std::vector<double>& where, double nearTime, double slantStep,
                                         double& worst);

struct StripMultilookRequest {
  std::string slc;         ///< the SLC raster
  std::string output;      ///< the output raster R
  int azimuthLooks = 0;    ///< 0: the annotation's suggested looks (both factors)
  int rangeLooks = 0;
  bool groundRange = false;
  double groundStep = 0.0; ///< m; 0: the mean ground step of the multilooked slant cells
  bool coherent = false;
};

struct StripMultilookResult {
  int lines = 0;
  int samples = 0;
  int azimuthLooks = 0;
  int rangeLooks = 0;
  double firstLineTime = 0.0;  ///< sec85 of the first output line
  double lineStep = 0.0;       ///< s
  double nearTime = 0.0;       ///< two-way s of the first output sample
  double rangeSpacing = 0.0;   ///< m (slant, or ground with groundRange)
  std::array<double, 5> groundSlantTime{};  ///< ground range: slant time of column j, see fit_ground_columns
  std::string error;           ///< why a run failed
};

int run_strip_multilook(const StripMultilookRequest& request, StripMultilookResult& result);

}  // namespace sar::multilook

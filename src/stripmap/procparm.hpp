#pragma once
// The record that carries a stripmap job from stage to stage, and the azimuth configuration.
#include <array>
#include <memory>
#include <complex>
#include <string>
#include <cstdint>
#include <vector>

#include "dsp/fft.hpp"
#include "io/line_store.hpp"
#include "metadata/scene_references.hpp"

namespace sar::stripmap {

/// Nine doubles a0..a8: f = a0 + a1 x + a2 y + a3 x y + a4 x^2 + a5 x^3 + a6 x^4,
/// x = range time - a7, y = azimuth time - a8.
using DopplerPoly = std::array<double, 9>;

/// A located point of the scene: times and geographic coordinates (degrees).
struct LocatedPoint {
  double rangeTime = 0.0;
  double azimuthTime = 0.0;
  double latitude = 0.0;
  double longitude = 0.0;
};

/// The scene's orbit, range reference and elevation pattern come from the sensor reader.
struct procparm : metadata::SceneReferences {
  int32_t progressFlag = 0;
  int32_t rangeSamples = 0;
  int32_t lines = 0;
  int32_t focusedSamples = 0;
  int32_t focusedLines = 0;
  // near-early, far-early, near-late, far-late, centre
  std::array<LocatedPoint, 5> corners{};
  double centreIncidence = 0.0;
  double centreLook = 0.0;
  DopplerPoly dopplerCentroid{};
  DopplerPoly dopplerRate{};
  DopplerPoly outputCentroid{};
  DopplerPoly outputRate{};
  DopplerPoly lookAngle{};
  DopplerPoly incidenceAngle{};
  double centroidOverride = 0.0;
  int32_t Report_level = 0;
  int32_t Flag_ortog = 0;
  int32_t Flag_swstal = 0;
  int32_t Flag_incore = 0;
  // FFT length of the range correlation; in core mode also the row pitch of the raw matrix.
  int32_t paddedLength = 0;
  // The block buffer, or in core mode the whole matrix (pitch paddedLength while raw, then
  // rangeSamples after range compression, focusedSamples after azimuth focusing). Grown
  // without clearing: every row is written before it is read.
  dsp::cmatrix matrix;
  // Per line: window start offset in samples against the earliest window.
  std::vector<int32_t> lineShifts;
  // Core mode: the raw lines as the extraction left them in memory (no line file); init_buffer
  // takes them out and lets the store go.
  std::shared_ptr<io::LineStore> rawLines;
  // Core mode with the quadrature repair: the sums of each raw line (I, Q, I^2, Q^2, I Q), taken
  // by init_buffer while the line passes through the cache, for rangefoc.
  std::vector<std::array<double, 5>> rawSums;
  int32_t Azblk = 0;
  double equivalentVelocity = 0.0;   // m/s, at the scene's first block
  double azimuthPixelSpacing = 0.0;  // velocity / PRF, m
  double rangePixelSpacing = 0.0;    // (c/2) / fs, m
  double sceneCentroid = 0.0;        // Hz, scene centre line and first near range
  double firstLineTime = 0.0;        // sec85 of focused line 0
  int32_t focusedLead = 0;           // range-compressed lines before the first focused line
  int32_t focusedTrail = 0;          // lines each azimuth block held after its output
  // Images that must share one line grid (the polarisations of one product) are focused with
  // the lead and trail of the first; -1: each block's from the apertures of this image.
  int32_t requiredLead = -1, requiredTrail = -1;
  double firstSampleTime = 0.0;      // two-way range time of focused sample 0
};

/// Value of a nine-coefficient Doppler polynomial at range time r and azimuth time t.
inline double DCeval(const DopplerPoly& a, double r, double t) {
  const double x = r - a[7];
  const double y = t - a[8];
  return a[0] + a[1] * x + a[2] * y + a[3] * x * y + a[4] * x * x + a[5] * x * x * x + a[6] * x * x * x * x;
}

/// A focused or raw rectangle: azimuth start time (sec85), range start time (two-way s), sizes.
struct cutrect {
  double azimuthStart = 0.0;
  double rangeStart = 0.0;
  int32_t lines = 0;
  int32_t samples = 0;
};

/// Section "AzimuthConf". Bandwidths are fractions of the sampling rate (range) or PRF (azimuth)
/// in the file; the azimuth stage scales them to Hz for its run.
struct azimuthconf {
  double AntennaLength = 0.0;
  int32_t WhiteningFlag = 0;
  double RangeWindowHammingParameter = 0.0;
  double AzimuthWindowHammingParameter = 0.0;
  double RangeLookBandwidth = 0.0;
  double AzimuthLookBandwidth = 0.0;
  double RangeTransitionBandwidth = 0.0;
  double AzimuthTransitionBandwidth = 0.0;
  int32_t LinesInBlock = 0;
  int32_t SamplesInBlock = 0;
  int32_t RangeOverlap = 0;    // stored halved
  int32_t AzimuthOverlap = 0;  // stored halved
  int32_t PerformInterpolation = 0;
  double StoltPadding = 0.0;
  double azimuthShift = 0.0;
  double rangeShift = 0.0;
};

/// Reads section "AzimuthConf" of a parameter file into `az` (overlaps halved), all but the
/// shift flags `ApplyAzShift` and `ApplyRgShift`, whose meaning each job sets; a missing key
/// ends the process as every parameter read does.
void read_azimuthconf(const std::string& parameterFile, azimuthconf& az);

}  // namespace sar::stripmap

#pragma once
// Configuration of the Doppler centroid estimator, section "DCestConf" of the parameter file,
// and the working state and results of one estimation.
#include <array>
#include <complex>
#include <cstdint>
#include <memory>
#include <span>
#include <string>
#include <vector>

namespace sar::doppler {

using fcomplex = std::complex<float>;

/// Nine doubles a0..a8: f = a0 + a1 x + a2 y + a3 x y + a4 x^2 + a5 x^3 + a6 x^4,
/// x = range time - a7, y = azimuth time - a8. The same layout as the stripmap record's.
using DopplerPoly = std::array<double, 9>;

/// The WDAR offset before it has been measured.
inline constexpr double kNoWdarOffset = -9999.9999;

/// Statistics of one grid block. Centroids are in cycles of the PRF.
struct dcblock {
  int32_t sample = 0;  ///< centre sample
  int32_t line = 0;    ///< centre line
  int32_t valid = 0;   ///< the block statistics were measurable
  double centroid = 0.0;  ///< fractional centroid, -0.5..0.5
  double contrast = 0.0;
  double power = 0.0;      ///< mean power per range bin
  double noise = 0.0;      ///< noise power per range bin
  double snr = 0.0;
  double phaseVariance = 0.0;
  int32_t good = 0;    ///< valid with a positive SNR and a signal: enters the polynomial fit
  int32_t filled = 0;  ///< centroid taken from neighbours
  // Kept for every block, valid or not.
  double meanPower = 0.0;             ///< mean power per sample
  std::complex<double> lag1{};        ///< lag-one azimuth correlation summed over the block
  int64_t lagTerms = 0;               ///< products in that sum
  int32_t signal = 0;  ///< its lag-one correlation stands clear of what the noise floor gives
};

/// A high-contrast block chosen for the multi-look beat frequency estimator.
struct mlbfblock {
  int32_t sample = 0;
  int32_t line = 0;
  int32_t spare = 0;
  std::vector<double> estimates;  ///< one per look pair; candidate ambiguities after the decision
  std::vector<double> quality;    ///< peak over the largest side value of each beat spectrum
};

/// A low-contrast block chosen for the wavelength diversity estimator.
struct wdarblock {
  int32_t sample = 0;
  int32_t line = 0;
  double estimate = 0.0;  ///< absolute centroid in PRF, then candidate ambiguity
};

/// Trimmed statistics of one set of candidate ambiguities.
struct ambstats {
  double mean = 0.0;
  double std = 0.0;
  int32_t count = 0;  ///< values kept by the last trim
  int32_t total = 0;  ///< values in the set
};

/// Which answer the ambiguity field holds.
enum class AmbiguityDecision : int32_t {
  None = 0,              ///< Amb_flag 0: ambiguity 0 by configuration
  Geometry = 1,          ///< Amb_flag 2: geometric prediction by configuration
  Mlbf = 2,              ///< beat frequency estimator, reliable
  Wdar = 3,              ///< wavelength diversity estimator alone (beat frequency unreliable)
  GeometryFallback = 4,  ///< neither estimator could decide: geometric prediction applied
};

/// Where the applied centroid came from.
enum class CentroidSource : int32_t {
  Fit = 0,       ///< the fitted surface of the blocks, all gates passed
  Constant = 1,  ///< one fractional centroid from the lag-one correlation of all signal blocks
  Geometry = 2,  ///< the orbit and attitude law alone
};

/// What a source is called in the log: "fitted surface of the blocks", "one constant from all
/// signal blocks", "orbit geometry".
const char* centroid_source_text(CentroidSource source);

/// The plausibility checks of a data estimate and what they found. A bound of 0 means the
/// check was not made.
struct CentroidGates {
  CentroidSource source = CentroidSource::Fit;
  std::string failed;           ///< the first gate that failed ("" when none did)
  std::string reason;           ///< its value against its bound, in words
  double noiseFloor = 0.0;      ///< mean noise power per sample the signal test used
  int32_t signalBlocks = 0;     ///< blocks whose lag-one correlation shows a signal
  double slopeLow = 0.0, slopeHigh = 0.0;  ///< allowed range slopes, Hz/s
  double slopeWorst = 0.0;      ///< fitted slope farthest from the geometric one, Hz/s
  int32_t outliers = 0;         ///< blocks set aside as lying off the surface of the others
  double scatter = 0.0;         ///< weighted scatter of the block centroids about the fit over its prediction
  double scatterBound = 0.0;
  double constantCycles = 0.0;  ///< the fractional centroid of all signal blocks, cycles
  double constantCoherence = 0.0;  ///< its lag-one magnitude over the noise-only magnitude
};

namespace detail {
struct WdarState;
struct MlbfState;
}  // namespace detail

struct dcestconf {
  int32_t progressFlag = 0;  // copied from the job record
  int32_t Flag_incore = 0;   // copied from the job record
  int32_t Memory = 0;
  double RgBand = 0.0;
  int32_t Blocks = 0;
  int32_t Blockl = 0;
  double AnLen = 0.0;
  double Kthr = 0.0;
  double Lookbf = 0.0;
  double Lookbt = 0.0;
  double Lookrp = 0.0;
  double Lookrs = 0.0;
  int32_t Decfac = 0;
  int32_t Flength = 0;
  double Dftstep = 0.0;
  double Fftrgprc = 0.0;
  double Fftazprc = 0.0;
  double Peakwid = 0.0;
  double Minamb = 0.0;
  double Maxamb = 0.0;
  double Sthr = 0.0;
  int32_t Nbestblocks = 0;
  int32_t Nummlbf = 0;
  int32_t Nwdarblocks = 0;
  double Varthr = 0.0;
  int32_t Patchs = 0;
  int32_t Patchl = 0;
  int32_t Dswst = 0;
  int32_t Amb_flag = 0;
  std::array<int32_t, 7> Pol_Weights{};
  // Filled by the job before the estimation.
  std::string inputPath;    ///< range-compressed file (file mode)
  std::string outputDir;    ///< result directory of DCEST_resume.txt
  double wantedPolyPoints = 0.0;  ///< platform speed the job hands to the image description, m/s
  double carrier = 0.0;            ///< radar frequency, Hz
  double fs = 0.0;                 ///< range sampling rate, Hz
  double geometricCentroid = 0.0;  ///< Hz at scene centre, from the orbit geometry
  /// Range slope of the centroid across the swath the orbit and the attitude law predict, and
  /// the largest change of it an attitude error can bring (Hz per second of two-way time). A
  /// fitted slope outside geometricSlope +- slopeTolerance is not applied; a tolerance of 0
  /// switches the check off.
  double geometricSlope = 0.0;
  double slopeTolerance = 0.0;
  /// Largest attitude error (yaw and pitch, degrees) the slope tolerance allows for.
  double AttitudeErrorBound = 1.0;
  /// Largest weighted scatter of the block centroids about the fit, in standard deviations of
  /// the blocks' own phase variance.
  double CentroidScatterBound = 10.0;
  /// Core mode: the range-compressed matrix, lines x samples of the image description.
  std::span<const fcomplex> coreMatrix;

  // Working values and results of one estimation.
  double r0 = 0.0;  ///< theoretic autocorrelation at lag 0
  double r1 = 0.0;  ///< theoretic autocorrelation at lag 1
  double wdarOffset = kNoWdarOffset;
  int32_t ambiguity = 0;
  int32_t geometricAmbiguity = 0;
  AmbiguityDecision decision = AmbiguityDecision::None;
  int32_t gridBlocks = 0;
  int32_t blocksAcross = 0;
  int32_t blockRows = 0;
  int32_t rowsInMemory = 0;
  int32_t patchesAcross = 0;
  int32_t patchesDown = 0;
  std::vector<dcblock> blocks;
  std::vector<mlbfblock> mlbfBlocks;
  std::vector<wdarblock> wdarBlocks;
  std::vector<float> powerMap;     ///< mean power per patch
  std::vector<float> contrastMap;  ///< mean squared power per patch, then the contrast
  ambstats mlbfStats;
  ambstats wdarStats;
  CentroidGates gates;
  /// Plane of the phase field: range slope, azimuth slope (cycles per sample, per line), offset.
  std::array<double, 3> plane{};
  std::shared_ptr<detail::WdarState> wdar;
  std::shared_ptr<detail::MlbfState> mlbf;
};

/// Reads section "DCestConf" of a parameter file into the configuration fields of `dc`; a
/// missing mandatory key ends the process as every parameter read does. `Memory`,
/// `Pol_Weights`, `AttitudeErrorBound` and `CentroidScatterBound` are optional.
void read_dcestconf(const std::string& parameterFile, dcestconf& dc);

}  // namespace sar::doppler

#pragma once
// Wide swath (ScanSAR) burst chain: five sub-swaths, each imaged in short bursts, each burst
// focused alone and its lines placed on one azimuth time grid common to every burst and
// sub-swath.
//
// Stages, each callable on its own so that a job can stop after one and resume later:
//   derive_geometry      the acquisition of the five sub-swaths from their `sarpar` records
//   burst_range_focus    per sub-swath: I/Q repair, window alignment, range compression with a
//                        Hamming weight, invalid columns trimmed; the correlation sums of
//                        adjacent echoes are kept for the centroid
//   burst_doppler        centroid per sub-swath from the sums, ambiguity resolved jointly over
//                        the sub-swaths' different PRFs and checked against the orbit; the
//                        Doppler rate and the slant-to-ground geometry from the orbit
//   burst_azimuth_focus  per burst: Hamming weight, omega-K compression of the burst padded to
//                        three times its length, deramp, replication of the periodic block,
//                        alias-rejection low-pass, resampling onto the common time grid, reramp
//                        and de-scalloping
//
// Files under the work directory D, s = 1..5:
//   D/SS<s>            extracted echoes (the extraction's line file: float32 range time, samples)
//   D/rgfoc_ss<s>      per burst a float64 near range time, then echoes x width complex floats
//   D/rgfoc_ss<s>.hdr  range focusing parameters
//   D/doppler.par      the centroid and rate estimates, read back by a resumed run
//   D/SS<s>.out        azimuth focused lines: a 17-byte big-endian prefix (MJD2000 days, seconds,
//                      microseconds, a zero flag byte, the output line number), then the samples
//   D/SS<s>.out.hdr    everything the multilooker needs of the sub-swath
#include <array>
#include <complex>
#include <cstdint>
#include <functional>
#include <span>
#include <string>
#include <vector>

#include "metadata/acquisition.hpp"
#include "metadata/scene_references.hpp"

namespace sar::scansar {

using fcomplex = std::complex<float>;
using metadata::sarpar;
inline constexpr int kSwaths = 5;
/// Echoes between the last echo of a burst and the end of its block: the calibration pulse and
/// the change-over PRI. The block's first rank - kBurstSpacing PRIs hold noise packets.
inline constexpr int kBurstSpacing = 2;
/// Beam slots (1-based) of SS1..SS5 in the ASA_INS and ASA_XCA pattern tables.
inline constexpr std::array<int, kSwaths> kBeamSlot = {8, 3, 4, 5, 6};
/// Mid-swath incidence angles (degrees) of SS1..SS5 for the range look bandwidths.
inline constexpr std::array<double, kSwaths> kLookIncidence = {21.64, 28.62, 33.62, 37.5, 40.87};

/// The acquisition of the five sub-swaths. Index s is the sub-swath (SS1 = 0).
struct scansar {
  double samplingRate = 0.0;      // Hz
  double carrierFrequency = 0.0;  // Hz
  double firstLineTime = 0.0;     // sec85: first echo of the first burst of the first fired sub-swath
  double cycleTime = 0.0;         // s
  int32_t bursts = 0;             // bursts per sub-swath
  std::array<double, kSwaths> prf{}, nearTime{}, farTime{}, burstOffset{}, pulseLength{}, chirpBandwidth{};
  std::array<int32_t, kSwaths> rank{}, spacing{}, echoes{}, samples{}, spread{}, fftLength{};
  std::array<int32_t, kSwaths> order{};      // firing list: position k fires sub-swath order[k]
  std::array<int32_t, kSwaths> successor{};  // sub-swath fired after sub-swath s
  std::array<double, kSwaths> lookBandwidth{};  // Hz, range look band for a ground resolution
};

/// Two-way elevation antenna pattern of a sub-swath: linear amplitudes of the 201 table entries,
/// the middle one at look angle `reference` (rad from the geocentric vertical at the
/// satellite), 0.05 degrees apart (0.072 degrees for a negative reference). Empty: no correction.
struct ElevationPattern {
  std::vector<float> amplitude;
  double reference = 0.0;
  double step() const;
};

/// Statistics of a focused sub-swath over its samples that are not both zero.
struct ImageStatistics {
  double sumRe = 0.0, sumIm = 0.0, sumRe2 = 0.0, sumIm2 = 0.0, sumAmplitude = 0.0, sumPower = 0.0;
  double peakRe = 0.0, peakIm = 0.0;
  int64_t count = 0;
  void add(std::span<const std::complex<float>> samples);
  void merge(const ImageStatistics& other);
  double mean_re() const { return count ? sumRe / count : 0.0; }
  double mean_im() const { return count ? sumIm / count : 0.0; }
  double std_re() const;
  double std_im() const;
  double mean_amplitude() const { return count ? sumAmplitude / count : 0.0; }
  double mean_power() const { return count ? sumPower / count : 0.0; }
};

/// Ground points (latitude, longitude, degrees) of a focused sub-swath's corners: earliest and
/// latest line, near and far column, and its centre.
struct SceneCorners {
  bool valid = false;
  std::array<double, 2> firstNear{}, firstFar{}, lastNear{}, lastFar{}, centre{};
};

/// Doppler granules along the scene, of `length` bursts: granule 0 and the last take the whole
/// scene; granule k (1 .. count - 2) the bursts [first[k], first[k] + length). Granule g is
/// centred at referenceTime + g step seconds from the scene's first line.
struct GranuleLayout {
  int32_t count = 1;
  double referenceTime = 0.0;  // s from the scene's first line
  double step = 0.0;           // s
  std::vector<int32_t> first;  // first burst (0-based) of each granule
  int32_t length = 0;          // bursts of a granule between the first and the last
};
GranuleLayout granule_layout(int32_t bursts, int32_t length, double cycleTime);
/// The granule whose polynomials burst b uses: the one centred nearest the middle of the
/// granule-long run of bursts that starts at the last multiple of the length at or before b.
int32_t granule_of_burst(const GranuleLayout& g, const scansar& scan, int s, int32_t b);

/// Processing choices (section "Focusing_parameters") and the running state of a run.
struct wsparm {
  std::array<int32_t, kSwaths> swathsToProcess{1, 1, 1, 1, 1};
  int32_t firstBurst = 1, lastBurst = 0;  // 1-based; lastBurst 0: all
  double azimuthStep = 0.0006;            // s, spacing of output lines
  double rangeHamming = 0.75;             // Rg_win_hamm; 1: no weight
  int32_t rangeFilterLength = 8;          // Rg_win_len
  double azimuthHamming = 0.75;           // Az_burst_hamm_win; 1: no weight
  double windowWidth1 = 0.5, windowWidth2 = 0.5;  // in burst cycles
  double groundResolution = 150.0;        // m
  int32_t compensateAntenna = 1;          // de-scalloping
  bool normalisedSinc = false;            // the pattern's sinc as sin(pi y)/(pi y): wrong, kept to show it
  int32_t burstPadding = 3;               // a burst is focused in genpow(burstPadding x echoes) lines
  int32_t samplesInBlock = 512;           // range sub-block of the omega-K kernel
  int32_t rangeOverlap = 32;              // full overlap of range sub-blocks
  double antennaLength = 10.0;            // m
  double centroidReference = -1e10;       // Hz; above -1e9 the ambiguity is taken from it
  std::array<ElevationPattern, kSwaths> elevation{};  // per sub-swath; empty: not corrected
  int32_t granuleLength = 20;             // bursts of a Doppler granule (DC_Granule_Length / 2)
  // Running results per sub-swath.
  std::array<double, kSwaths> earliestTime{}, latestTime{};
  std::array<int32_t, kSwaths> firstLine{}, lastLine{};
  std::array<int32_t, kSwaths> linesPerBurst{};
  std::array<ImageStatistics, kSwaths> statistics{};
  std::array<SceneCorners, kSwaths> corners{};
};

/// Fills `scan` from the five channels (index = sub-swath) the extraction gave. Returns 0, or 10
/// with a report for channels that do not describe a wide swath acquisition (not five, no PRF,
/// no echoes, a firing list that is not a permutation, bursts that disagree).
int derive_geometry(std::span<const sarpar> channels, scansar& scan);

/// Burst selection against the product; lastBurst 0 becomes the burst count. Returns 0, or 1
/// with "Wrong number of bursts to focus chosen".
int check_bursts(const scansar& scan, wsparm& par);

/// Correlation sums of adjacent echoes over all bursts of a sub-swath, per output column:
/// sum of z[i] conj(z[i-1]), the pairs' mean power (|z[i]|^2 + |z[i-1]|^2) / 2, and the count of
/// pairs.
struct CorrelationSums {
  std::vector<std::complex<double>> sum;
  std::vector<double> power;
  int64_t pairs = 0;
  std::vector<CorrelationSums> granules;  // the same per Doppler granule (granule_layout)
  void add(const CorrelationSums& burst);
};

/// What range focusing gives per sub-swath.
struct RangeFocused {
  int32_t width = 0;         // samples of a focused echo
  int32_t firstValid = 0;    // columns before it hold the alignment's zeros
  int32_t validColumns = 0;  // columns that every echo fills whole
  double nearTime = 0.0;     // two-way time of column 0
};

/// Range focusing of sub-swath s from `channel.raw_file` into `D/rgfoc_ss<s+1>`, with the
/// nominal replica `replica` (centred). Returns 0, or 10 for a line file that does not hold the
/// bursts, or the file I/O code.
int burst_range_focus(const std::string& dir, int s, const sarpar& channel, const scansar& scan, const wsparm& par,
                      std::span<const fcomplex> replica, RangeFocused& out, CorrelationSums& sums);

/// c0 + c1 x + c2 x^2 + c3 x^3 + c4 x^4: the polynomials of the records below.
inline double poly4(const std::array<double, 5>& c, double x) {
  return c[0] + x * (c[1] + x * (c[2] + x * (c[3] + x * c[4])));
}

/// Centroid and rate of every sub-swath, as polynomials in two-way range time about refTime
/// (the near range of SS1), evaluated by `poly4`.
struct DopplerEstimate {
  double refTime = 0.0;
  std::array<std::array<double, 5>, kSwaths> centroid{};
  std::array<std::array<double, 5>, kSwaths> rate{};
  std::array<double, kSwaths> fractional{};  // Hz, the data's centroid at mid swath, within one PRF
  std::array<int32_t, kSwaths> ambiguity{};
  std::array<double, kSwaths> geometric{};   // Hz, the orbit's centroid at mid swath
  double satelliteSpeed = 0.0;               // |V|, Earth-fixed, m/s
  std::array<double, kSwaths> incidence{};   // degrees, mid swath
  std::array<std::array<double, 5>, kSwaths> slantToGround{};  // ground range (m) in range time about each near time
  std::array<std::array<double, 5>, kSwaths> slantToElevation{};  // look angle (rad) in range time about each near time
  bool ambiguityDoubtful = false;
  bool geometricApplied = false;  // the data disagreed with the orbit by more than half a PRF
  // Per Doppler granule g (granule_layout; granule 0 is the whole scene, as centroid and rate
  // above): centroid and rate polynomials of every sub-swath.
  double granuleReference = 0.0, granuleStep = 0.0;  // s from the scene's first line
  std::vector<std::array<std::array<double, 5>, kSwaths>> granuleCentroid, granuleRate;
};

/// Geometric centroid (Hz) at azimuth time t and range time tau: the orbit in `refs` and the
/// antenna's attitude, here the zero-Doppler steering of ENVISAT. The callable lets a test or a
/// job give another law.
using GeometricCentroid = std::function<double(const metadata::SceneReferences& refs, double t, double tau, double wavelength)>;
double zero_doppler_centroid(const metadata::SceneReferences& refs, double t, double tau, double wavelength);

/// Burst Doppler estimation of the selected sub-swaths. `sums` may be empty for a sub-swath
/// (the geometric centroid is then used). Returns 0, or 10 when the orbit gives no geometry.
int burst_doppler(const scansar& scan, const wsparm& par, const metadata::SceneReferences& refs,
                  std::span<const RangeFocused> focused, std::span<const CorrelationSums> sums,
                  DopplerEstimate& est, const GeometricCentroid& geometric = zero_doppler_centroid);

/// The estimate to and from `D/doppler.par`. Return 0, or 1 when the file is missing or short.
int save_doppler(const std::string& path, const DopplerEstimate& est, std::span<const RangeFocused> focused);
int load_doppler(const std::string& path, DopplerEstimate& est, std::array<RangeFocused, kSwaths>& focused);

/// The antenna's two-way power pattern against the Doppler of a line, as de-scalloping uses it.
struct ScallopModel {
  double lengthOverWavelength = 0.0;  // L / lambda
  double halfWavelengthOverSpeed = 0.0;  // lambda / (2 |V|)
  bool normalisedSinc = false;
  /// Two-way power gain of Doppler f for a beam centred on centroid fdc.
  double gain(double f, double fdc) const;
  /// The factor a line of Doppler f is multiplied by: 1 / (sqrt(G(f) + G(f + prf) + G(f - prf)) + 1e-4).
  double scale(double f, double fdc, double prf) const;
};

/// Range gain of the elevation antenna correction: gain[j] = 1 / P(theta_j), P the pattern
/// linear between entries, theta_j the look angle of column j, slantToElevation evaluated at
/// x0 + j / fs. Columns whose look angle falls outside the table keep gain 1 and are reported
/// once, "out of antenna beam range". Returns the count of such columns.
int envi_beam_corr(const ElevationPattern& pattern, const std::array<double, 5>& slantToElevation, double x0, double fs,
                   std::span<float> gain);

/// Azimuth focusing of sub-swath s from `D/rgfoc_ss<s+1>` into `D/SS<s+1>.out`. Returns 0, or
/// 10 for inputs that cannot be focused, or the failing step's status.
int burst_azimuth_focus(const std::string& dir, int s, const scansar& scan, wsparm& par,
                        const DopplerEstimate& est, const RangeFocused& focused);

/// Half the azimuth window of a burst's output, seconds.
double half_window(const scansar& scan, const wsparm& par);

/// Output line number of time t (sec85) on the common grid, and the time of a line.
double line_time(const scansar& scan, const wsparm& par, int64_t line);

/// Header of a focused sub-swath, `D/SS<s+1>.out.hdr`. Returns 0, or the profile's status.
int write_WShdr(const std::string& path, int s, const scansar& scan, const wsparm& par, const DopplerEstimate& est,
                const RangeFocused& focused, bool ascending);

/// Stages of a run. A run that skips range and Doppler reads their results back from
/// `D/doppler.par` and the range focused files; one that skips azimuth stops after writing them.
struct WsStages {
  bool rangeDoppler = true;
  bool azimuth = true;
  bool deleteTemporary = true;  // the range focused files go once azimuth focusing is done
};

/// The wide swath processor: from the five extracted sub-swaths (`channels`, index = sub-swath,
/// their line files named in raw_file) and the scene's orbit and nominal replica (`refs`), the
/// focused sub-swaths `D/SS<s>.out` with their headers, for the sub-swaths par.swathsToProcess
/// selects. Returns 0, 1 for a burst selection outside the product, 10 for inputs that do not
/// describe a wide swath acquisition, or the failing stage's status.
int WSprocessor(const std::string& dir, std::span<const sarpar> channels, const metadata::SceneReferences& refs,
                wsparm& par, const WsStages& stages, bool ascending,
                const GeometricCentroid& geometric = zero_doppler_centroid);

/// A 17-byte line prefix.
void encode_line_prefix(double sec85, int32_t line, unsigned char* out17);
double decode_line_prefix(const unsigned char* in17, int32_t& line);

}  // namespace sar::scansar

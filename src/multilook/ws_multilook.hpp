#pragma once
// Wide swath multilook and swath recomposition: five sub-swaths of focused bursts into one
// detected image, slant or ground range.
//
// Per sub-swath, burst by burst:
//   - azimuth: every line is weighted by where it stands against its burst's centre, in burst
//     cycles, v = (fc / fr + t - tc) / cycle: 1 within W1, a taper cos(pi q / 2) on amplitude
//     over W2 (q = (|v| - W1) / W2), 0 beyond. With 2 W1 + W2 a whole number the power weights
//     of overlapping bursts add up to one at every line, so the bursts sum in power into one
//     continuous image without scalloping. The burst centre is the middle of the burst's lines.
//   - range: m looks of band b each, spread evenly over the sub-swath's band B, cut from the
//     line's spectrum (square, so that a look resolves the ground resolution asked for), brought
//     to base band at the decimated rate and detected; each look's
//     power is scaled by its share of the band, so a uniform scene keeps its level whatever b is
//     in each sub-swath, and the m looks are averaged. A range spectrum weighted by a window
//     holds less power in the outer looks than in the middle ones: the sum is divided by the
//     share of the window's power the looks hold (look_power_share), else a weighted uniform
//     scene would stand 0.15 dB higher in SS1 than in SS2.
// The sub-swaths are joined on the decimated range grid of the first, each keeping its columns
// up to the middle of its overlap with the next; the range spreading loss is removed
// (power x (R / Rref)^3, Rref the mid-swath range) and the result written as amplitude, in
// slant range or resampled onto GrSamplingStep metres of ground.
#include <array>
#include <string>
#include <vector>

#include "io/cell_types.hpp"
#include "multilook/strip_multilook.hpp"

namespace sar::multilook {

/// One sub-swath's bursts in a raster of records: a row prefix with the line's zero-Doppler time
/// (MJD2000, big-endian), then the samples: complex int16 big-endian in a level 1 product,
/// complex float32 in the host's order in the burst chain's own focused sub-swaths.
struct WsSubSwath {
  std::string path;
  int64_t offset = 0;      // of the first record
  int64_t records = 0;
  int32_t rowPrefix = 17;
  int samples = 0;
  int32_t cellType = io::kShortComplex;
  int32_t byteOrder = io::kBigEndian;
  double nearTime = 0.0;   // two-way s of sample 0
  double incidence = 0.0;  // deg, at near range
  double centroid = 0.0;   // Hz
  double rate = -2000.0;   // Hz/s
  // Hamming coefficient a of the window the range spectrum carries over the chirp band,
  // (a + (1 - a) cos(2 pi f / B))^2 in power; 1: a flat spectrum.
  double rangeWindow = 1.0;
};

struct WsMultilookConfig {
  int groundRange = 0;         // Sl2Gr
  int groundStep = 75;         // GrSamplingStep, m
  int groundResolution = 150;  // GrResolution, m
  double w1 = 0.25;            // W1: flat part, burst cycles
  double w2 = 0.5;             // W2: taper, burst cycles
  int burstsToSkip = 0;
  int burstsToProcess = 0;     // 0: all that remain
  double rangeBand = 16.0e6;   // Hz, the chirp band of the sub-swaths
  double samplingRate = 19.20768e6;
  double lineStep = 0.0;       // s between lines of the common grid
};

/// One burst of a sub-swath: its first record and time, and its lines.
struct Burst {
  int64_t firstRecord = 0;
  int lines = 0;
  double firstTime = 0.0;  // sec85
};

/// Bursts from the record times: a new burst starts where the time does not move on by about
/// one line step.
std::vector<Burst> find_bursts(const std::vector<double>& times, double lineStep);

/// Weight (amplitude) of a line v burst cycles from its burst's centre.
double burst_weight(double v, double w1, double w2);

/// The range look plan of one sub-swath: looks, the band of each and their centres (Hz).
struct LookPlan {
  int looks = 1;
  double band = 0.0;
  std::vector<double> centres;
};
/// Looks for a sub-swath of band B at incidence theta for the ground resolution; 0, or 1 when
/// more than 15 looks would be needed.
int plan_looks(double band, double incidence, int groundResolution, LookPlan& plan);
/// The centres of m looks of band b over a band B.
std::vector<double> look_centres(int looks, double band, double fullBand);
/// The mean power of looks of band b at `centres`, each scaled by its share of the band (B / b),
/// against the mean power of the whole band B, for a spectrum weighted by a Hamming window of
/// coefficient `window` over B: 1 for a flat spectrum; above 1 where the looks crowd the
/// middle of a weighted band (a narrow look band, near range).
double look_power_share(const std::vector<double>& centres, double band, double fullBand, double window);

struct WsMultilookResult {
  int lines = 0;
  int samples = 0;
  int rangeLooks = 0;
  int decimation = 1;
  double firstLineTime = 0.0;
  double lineStep = 0.0;
  double nearTime = 0.0;
  double slantStep = 0.0;    // s between slant columns
  double rangeSpacing = 0.0; // m of an output column
  double cycle = 0.0;        // s
  std::array<double, 5> groundSlantTime{};  // ground range: slant time of column j (fit_ground_columns)
  std::string error;
};

/// Runs the multilook into raster `output` (float amplitude, with .hdr and .vrt; the caller
/// writes the annotation). `orbit` gives the geometry for ground range (hasOrbit, carrier).
/// 0; 10 for a rejected configuration or input; 1 for I/O.
int run_ws_multilook(const std::array<WsSubSwath, 5>& swaths, const WsMultilookConfig& config, const SlcGrid& orbit,
                     const std::string& output, WsMultilookResult& result);

}  // namespace sar::multilook

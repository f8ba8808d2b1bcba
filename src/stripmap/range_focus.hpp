#pragma once
// First stage of stripmap focusing: raw lines in, range-compressed lines out.
//
// The raw line file (written by the extraction) holds per line a native float32 two-way time of
// the line's first sample, then the line's complex samples. Lines whose sampling window starts
// later are moved right by round((s - t_near) fs) samples so that a column is one slant range
// across the whole scene; with Flag_swstal 0 the time is still read past, only not applied.
//
// Sizes, for N raw samples, a replica of Lr samples and a window span W = round((t_far -
// t_near) fs): the correlation length L = genpow(N + W), the valid correlation length
// V = N - Lr + 1 and the output line V + W samples. Output sample k of a line with shift s holds
// the correlation of the raw line with the replica at lag k - s, moved back by the replica's
// lead (the nominal replica is sampled about the pulse centre, so its first sample lies half a
// sample into the pulse): a target whose echo's leading edge lies at raw sample n appears at
// output sample n + s, and output sample k is two-way time t_near + k / fs.
//
// Storage modes. File mode reads the raw file and writes the range file (lines x (V + W)
// complex float, no prefix) in blocks of Azblk lines. Core mode (`init_buffer` first) keeps
// the whole matrix in procparm::matrix, at pitch L while raw and at pitch V + W after range
// compression; `dest_buffer` writes the focused matrix at the end. Both modes give the same
// samples bit for bit: the same transforms run on the same rows.
#include <array>
#include <complex>
#include <cstdint>
#include <functional>
#include <span>

#include "metadata/acquisition.hpp"
#include "stripmap/procparm.hpp"

namespace sar::stripmap {

using metadata::sarpar;

/// Sizes of the range correlation of a product.
struct RangeSizes {
  int32_t rawSamples = 0;    // N
  int32_t replicaLength = 0; // Lr
  int32_t windowSpan = 0;    // W
  int32_t padded = 0;        // L
  int32_t valid = 0;         // V
  int32_t output = 0;        // V + W
};

/// Sizes for `par` and the replica of `proc`. Returns 0, or 10 (with a report) when the product
/// or the replica cannot be correlated: no samples, a replica longer than the line, a window
/// span below zero.
int range_sizes(const sarpar& par, const procparm& proc, RangeSizes& sizes);

/// Core mode: loads every raw line into procparm::matrix at pitch L, with the line shifts.
int init_buffer(const sarpar& par, procparm& proc);
/// Range compression in either mode.
int rangefoc(const sarpar& par, procparm& proc);
/// Core mode: writes the focused matrix (focusedLines x focusedSamples) to the SLC path and
/// frees the matrix and the line shifts. The file is written under a temporary name and
/// renamed when complete, so a failed write never leaves a product that looks whole.
int dest_buffer(const sarpar& par, procparm& proc);
/// The same; `written` sees each run of lines once it is written (while it is still in the
/// cache): first line, line count, and the lines at the focused pitch.
using WrittenLines = std::function<void(int32_t first, int32_t count, const std::complex<float>* lines)>;
int dest_buffer(const sarpar& par, procparm& proc, const WrittenLines& written);

/// Block counters of the running stage, read by the progress display.
struct BlockCounters {
  int32_t current = 0;
  int32_t total = 0;
};
BlockCounters& block_counters();

/// Maps between a wanted focused rectangle and the raw rectangle it needs, given the shifts of
/// a squinted geometry (azimuthconf's range and azimuth shift, s) and the half overlaps of the
/// azimuth blocks. `imcutter` returns 10 with a report when the raw data cannot hold it.
int imcutter(const sarpar& par, const procparm& proc, const azimuthconf& az, const cutrect& wanted, cutrect& needed);
int imcutter_inv(const sarpar& par, const procparm& proc, const azimuthconf& az, const cutrect& raw, cutrect& focused);

/// Quadrature repair of raw lines in place: DC bias, gain imbalance and the angle between the
/// channels, from running averages that carry over from block to block. A block index of 0
/// starts the averages afresh. Returns 0.
int ortogN(std::span<std::complex<float>> matrix, int32_t pitch, int32_t samples, int32_t lines, int32_t block);

/// The quadrature repair in its three steps, so that its passes can ride on others over the
/// same lines: the sums of each line (independent, any thread), the corrections from the
/// running averages (over the lines in order, carrying over from block to block as ortogN
/// does), and the correction of each line (independent). The energies and the correlation of
/// the corrected channels follow from the sums of the raw samples by expanding the squares.
/// ortogN is the three in a row.
using OrtogMoments = std::array<double, 5>;  // sums of I, Q, I^2, Q^2, I Q
/// What one line gets: its means taken off, Q scaled by `gain`, then Q' = (Q - I s) inv.
struct OrtogCorrection {
  bool apply = false;
  bool rotate = false;
  float meanI = 0.0f, meanQ = 0.0f;
  double gain = 1.0;
  double s = 0.0, inv = 1.0;
};
OrtogMoments ortog_moments(const std::complex<float>* line, int32_t samples);
void ortog_corrections(std::span<const OrtogMoments> lines, int32_t samples, int32_t block,
                       std::span<OrtogCorrection> out);
void ortog_apply(std::complex<float>* line, int32_t samples, const OrtogCorrection& c);

/// The running averages of ortogN (process-wide, so blocks must come in order).
struct OrtogState {
  double meanI = 0.0, meanQ = 0.0;
  double rmsI = 0.0, rmsQ = 0.0;
  double energyI = 0.0, energyQ = 0.0, correlation = 0.0;
  bool first = true;
};
OrtogState& ortog_state();

}  // namespace sar::stripmap

#pragma once
// Decoding of ASAR samples compressed on board by flexible block adaptive quantisation (FBAQ
// 8 to 4 bits), and the receive gain by which echo samples are divided.
//
// A 4-bit code is sign and magnitude: codes 0-7 are the positive levels in rising order, codes
// 8-15 the negative ones with 15 the largest in size. `kFbaqCodeMap` turns a code into the row
// of a reconstruction table whose rows run from the most negative level (row 0) to the most
// positive (row 15).
//
// Echo payloads are blocks of 64 bytes: a threshold byte that selects the table column, then
// 63 bytes of one complex sample each (I high nibble, Q low nibble). A line of N samples has
// B = floor(N / 63) whole blocks and, when r = N - 63 B is not 0, a short block of r + 1 bytes
// padded to an even length. Noise payloads have no blocks: one byte per sample, decoded with a
// fixed table, the line padded to an even length.
#include <array>
#include <cstdint>
#include <span>
#include <string>
#include <vector>

#include "envisat/aux_products.hpp"

namespace sar::envisat {

inline constexpr std::array<int, 16> kFbaqCodeMap = {8, 9, 10, 11, 12, 13, 14, 15, 7, 6, 5, 4, 3, 2, 1, 0};

/// Reconstruction levels of noise samples, by table row (the same for I and Q).
inline constexpr std::array<double, 16> kFbaqNoiseTable = {
    -0.05906, -0.051, -0.043, -0.035, -0.0275, -0.02, -0.012, -0.004,
    0.004,    0.012,  0.02,   0.0275, 0.035,   0.043, 0.051,  0.05906};

inline constexpr std::int64_t kFbaqBlockBytes = 64;
inline constexpr std::int64_t kFbaqBlockSamples = 63;

/// Number of receive gain values the extraction uses.
inline constexpr int kGainTableLength = 8192;

/// The two reconstruction tables of the run.
struct FbaqTables {
  FbaqLut i;
  FbaqLut q;
};

/// Byte layout of one echo line of N samples.
struct EchoLineLayout {
  std::int64_t wholeBlocks = 0;  // B
  std::int64_t remainder = 0;    // r, samples of the short block
  std::int64_t pad = 0;          // 0 or 1 padding byte after the short block
  std::int64_t lineBytes = 0;    // 64 B + 2 ceil((r + 1) / 2), the last term 0 when r is 0
};

EchoLineLayout echo_line_layout(std::int64_t samples);
/// N rounded up to even.
std::int64_t noise_line_bytes(std::int64_t samples);

/// True when the payload is a whole number of echo (noise) lines of `samples` samples; false
/// for a sample count below 1.
bool packet_fits_echo(std::int64_t samples, std::int64_t payloadBytes);
bool packet_fits_noise(std::int64_t samples, std::int64_t payloadBytes);

/// The reconstruction tables arranged for decoding: per threshold byte, the 16 levels of I and
/// the 16 of Q in code order, so a block's levels lie in two adjacent cache lines and a sample
/// costs two look-ups by its nibbles. Built once per run.
class FbaqEchoDecoder {
 public:
  explicit FbaqEchoDecoder(const FbaqTables& tables);
  /// As `fbaq_decode84_f` with a divisor of 1 and no report; returns false, writing nothing, when
  /// the payload is no whole number of lines.
  bool decode(std::span<const std::uint8_t> payload, std::span<float> out, int samples, int& floatCount,
              int& lineCount) const;
  /// As `decode`, then float j of every line is divided by divisors[j] (the receive gain, given
  /// twice per sample, beside its I and its Q). `divisors` must hold 2 x samples floats.
  bool decode_divided(std::span<const std::uint8_t> payload, std::span<float> out, int samples,
                      std::span<const float> divisors, int& floatCount, int& lineCount) const;

 private:
  std::vector<float> levels_;  // 256 thresholds x (16 I, 16 Q)
};

/// Decodes the echo lines of a payload into float pairs I, Q. `samples` is first divided by
/// `divisor`, rounding up. `out` must hold 2 x samples x lines floats. Returns 0, or 1 when the
/// payload is no whole number of lines (then " window length and packet size do not match!" is
/// reported at level 0 if `reportMismatch`, and nothing is written).
int fbaq_decode84_f(const FbaqTables& tables, std::span<const std::uint8_t> payload, std::span<float> out,
                    int samples, int divisor, int& floatCount, int& lineCount, bool reportMismatch = false);

/// Decodes noise with the fixed table. Only the first line of the payload is decoded; the line
/// count still tells how many the payload holds. `out` must hold 2 x samples floats. Returns 0,
/// or 1 as above (reported at level 1).
int fbaq_decode84fe(std::span<const std::uint8_t> payload, std::span<float> out, int samples, int divisor,
                    int& floatCount, int& lineCount, bool reportMismatch = false);

/// Receive gain of echo sample k, k = 0 to table.size() - 1, from the gain model of ASA_INS:
/// g[k] = 10 ^ (0.05 (a exp(-x / c2) + b exp(-x / c5) + d)), x = k 1e6 / fs in microseconds,
/// a = c0 T + c1, b = c3 T + c4, d = c6 T + c7.
void gain_table(const InsRecord& ins, std::span<float> table);
/// Reads the ASA_INS product and fills the table. Returns 0.
int read_gain_table(const std::string& insPath, std::span<float> table);

}  // namespace sar::envisat

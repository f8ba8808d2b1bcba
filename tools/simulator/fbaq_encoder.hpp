#pragma once
// Flexible block adaptive quantisation of echo samples, 8 bits to 4 bits (8:4), as ASAR packs
// its image mode echoes: blocks of 63 complex samples behind one threshold byte that picks a
// column of the reconstruction table; each sample byte holds I in its high nibble and Q in its
// low nibble, each a sign-and-magnitude code (0..7 positive rising, 8..15 negative, 15 the
// largest negative). A line ends with a short block, padded to an even length.
#include <array>
#include <cstdint>
#include <span>
#include <vector>

namespace sar::simulator {

inline constexpr int kFbaqBlockSamples = 63;
inline constexpr int kFbaqLevels = 16;
inline constexpr int kFbaqColumns = 256;

/// Reconstruction table: value[row][column], rows in rising order (row 0 the most negative),
/// the same table for I and Q. A simulated ASA_INS must carry it so that decoding is exact.
struct FbaqTable {
  std::array<std::array<float, kFbaqColumns>, kFbaqLevels> value{};
};

/// The simulator's table: 4-bit Lloyd-Max levels of a unit Gaussian scaled by the block sigma of
/// column t, sigma(t) = 0.25 (t + 1) ADC counts, so columns cover 0.25 to 64 counts.
const FbaqTable& simulator_fbaq_table();
/// Block standard deviation that column `t` is designed for.
double fbaq_column_sigma(int t);

/// Table row of a 4-bit code and back.
int fbaq_code_to_row(int code);
int fbaq_row_to_code(int row);

/// Bytes of one encoded line of `samples` complex samples.
std::size_t fbaq_line_bytes(int samples);

/// Encodes one line of interleaved I, Q values (2 x samples floats, in ADC counts) and appends
/// the bytes to `out`. Each block takes the column that gives it the smallest squared error.
void fbaq_encode_line(std::span<const float> iq, const FbaqTable& table, std::vector<uint8_t>& out);

/// Decodes one line with the same table (for tests and round-trip checks of the simulator).
std::vector<float> fbaq_decode_line(std::span<const uint8_t> bytes, int samples, const FbaqTable& table);

// Noise packets carry no blocks and no thresholds: each byte is one complex sample of the 4-bit
// receiver, I in the high nibble and Q in the low nibble, in the same sign-and-magnitude code.
// The 16 levels are fixed: the ADC's half-integer levels -7.5 to 7.5 counts, at full scale 1
// (127.5 counts), as the instrument's table states them. A line is padded to an even length.

/// Level of a noise code 0-15, as the instrument's fixed table gives it.
double noise_level(int code);
/// Bytes of a noise line of `samples` complex samples.
std::size_t noise_line_bytes(int samples);
/// Quantises one line of interleaved I, Q values in ADC counts to the 4-bit levels (clipping at
/// 7.5 counts) and appends its bytes to `out`. Returns the line's mean power in level units,
/// the sum of I^2 + Q^2 of the levels over the samples, divided by their count.
double noise_encode_line(std::span<const double> iq, std::vector<uint8_t>& out);

}  // namespace sar::simulator

#pragma once
// ENVISAT auxiliary products of the ASAR intake: the instrument characterisation (ASA_INS),
// the external calibration (ASA_XCA) and the external characterisation (ASA_XCH).
//
// Each product is a 1247-byte MPH, a 378-byte SPH holding one DSD, and one data set record.
// The readers check the product name, the DSD sizes against the file, and then read the record
// by position. A missing file raises the product's "does not exist" code, a file of another
// product type the bad-argument code with the type's name, and a broken file of the right type
// (truncated, sizes that disagree) the file I/O code naming the file, the field and the byte.
#include <array>
#include <complex>
#include <cstddef>
#include <cstdint>
#include <string>
#include <vector>

namespace sar::envisat {

/// Auxiliary product header layout (byte positions inside the MPH and the SPH).
inline constexpr std::size_t kAuxSphSize = 378;
inline constexpr std::size_t kAuxHeadersSize = 1247 + kAuxSphSize;  // 1625
inline constexpr std::size_t kMphTotSizePos = 1075;   // value of TOT_SIZE=
inline constexpr std::size_t kMphTotSizeWidth = 21;
inline constexpr std::size_t kSphDsOffsetPos = 231;   // value of DS_OFFSET=
inline constexpr std::size_t kSphDsSizePos = 268;     // value of DS_SIZE=
inline constexpr std::size_t kSphBigWidth = 21;       // "+" and 20 digits
inline constexpr std::size_t kSphNumDsrPos = 305;     // value of NUM_DSR=
inline constexpr std::size_t kSphDsrSizePos = 326;    // value of DSR_SIZE=
inline constexpr std::size_t kSphSmallWidth = 11;     // "+" and 10 digits

/// Record sizes (bytes).
inline constexpr std::size_t kInsRecordSize = 171648;
inline constexpr std::size_t kXcaRecordSize = 26552;
inline constexpr std::size_t kXchRecordSize = 596;
/// ASA_XCA is read at this fixed position; its DSD must agree.
inline constexpr std::size_t kXcaRecordPos = kAuxHeadersSize;

/// ASA_INS record offsets.
namespace ins {
inline constexpr std::size_t kCarrierFrequency = 16;       // float, Hz
inline constexpr std::size_t kSamplingFrequency = 20;      // float, Hz
inline constexpr std::size_t kRangeGateBias = 69912;       // float, s
inline constexpr std::size_t kFbaqLutI = 74656;            // 16 x 256 float
inline constexpr std::size_t kFbaqLutQ = 103328;           // 16 x 256 float
inline constexpr std::size_t kImBurstEchoes = 161606;      // uint16 + 2 beam
inline constexpr std::size_t kImRank = 161620;             // uint16 + 2 beam
inline constexpr std::size_t kApBlockEchoes = 161662;      // uint16 + 2 beam
inline constexpr std::size_t kApRank = 161676;             // uint16 + 2 beam
inline constexpr std::size_t kWsBurstEchoes = 161690;      // uint16 + 2 beam
inline constexpr std::size_t kWsRank = 161704;             // uint16 + 2 beam
inline constexpr std::size_t kPatternReferenceAngle = 161916;  // float + 4 beam, degrees
inline constexpr std::size_t kRowCoefficients = 162016;    // + 512 row + 256 pol, 32 complex
inline constexpr std::size_t kRowStride = 512;
inline constexpr std::array<std::size_t, 5> kWsRowCoefficients = {165600, 163040, 163552, 164064, 164576};
inline constexpr std::size_t kGainTemperature = 171368;    // float
inline constexpr std::size_t kGainCoefficients = 171372;   // 8 doubles
}  // namespace ins

/// ASA_XCH record offsets.
namespace xch {
inline constexpr std::size_t kLoopFactors = 16;  // + 256 pol, 32 complex
}

/// ASA_XCA elevation pattern: 201 floats (dB) per beam and polarisation, the value k of beam b
/// and polarisation p at 4 (201 (4 b + p) + k) - kPatternBias.
namespace xca {
inline constexpr int kPatternLength = 201;
inline constexpr std::int64_t kPatternBias = 2424;
}  // namespace xca

inline constexpr int kPolStride = 256;  // bytes between the H and V halves of a coefficient row
inline constexpr int kRowLength = 32;   // complex values per coefficient row

/// Instrument timeline whose swath table is meant.
enum class Timeline { kIm, kAp, kWs };

/// Sizes and validity of an auxiliary product, as its headers state them.
struct AuxHeader {
  std::string product;        // MPH product name
  std::string validityStart;  // MPH SENSING_START text, 27 characters
  std::string validityStop;   // MPH SENSING_STOP text
  std::int64_t totSize = 0;   // bytes
  std::int64_t dsOffset = 0;  // file position of the record
  std::int64_t dsSize = 0;
  std::int64_t numDsr = 0;
  std::int64_t dsrSize = 0;
};

using ComplexRow = std::array<std::complex<float>, kRowLength>;

/// One FBAQ reconstruction table: 16 rows (mapped code) by 256 columns (block threshold).
struct FbaqLut {
  std::array<float, 16 * 256> values{};
  float operator()(int row, int column) const { return values[static_cast<std::size_t>(row * 256 + column)]; }
};

/// Parameters that the level 0 intake takes from ASA_INS for one channel.
struct InsParameters {
  double carrierFrequency = 0.0;   // Hz
  double samplingFrequency = 0.0;  // Hz
  double rangeGateBias = 0.0;      // s
  std::int32_t burstEchoes = 0;    // echoes per burst (IM, WS) or block (AP)
  std::int32_t swathRank = 0;      // pulses in flight
};

/// A header and a record read from an auxiliary product.
class AuxProduct {
 public:
  const std::string& path() const { return path_; }
  const AuxHeader& header() const { return header_; }
  /// Validity period as sec85.
  double validity_start() const;
  double validity_stop() const;

 protected:
  AuxProduct() = default;
  void load(const std::string& path, int typeCode, std::size_t recordSize, bool fixedPosition);
  float f32(std::size_t offset, const char* field) const;
  std::uint16_t u16(std::size_t offset, const char* field) const;
  double f64(std::size_t offset, const char* field) const;
  ComplexRow complex_row(std::size_t offset, const char* field) const;

  std::string path_;
  AuxHeader header_;
  std::vector<std::uint8_t> record_;
};

/// ASA_INS: instrument characterisation.
class InsRecord : public AuxProduct {
 public:
  static InsRecord read(const std::string& path);

  float carrier_frequency() const;   // Hz
  float sampling_frequency() const;  // Hz
  float range_gate_bias() const;     // s
  FbaqLut lut_i() const;
  FbaqLut lut_q() const;
  /// Echoes per burst (IM, WS) or per block (AP) of a beam code: 1-7 for IM and AP, 15-19 for WS.
  int burst_echoes(Timeline timeline, int beam) const;
  int swath_rank(Timeline timeline, int beam) const;
  /// Look angle of the pattern's reference entry, degrees; beam code as above.
  float pattern_reference_angle(int beam) const;
  /// Row excitation coefficients of a row 0-6 and a polarisation 0 (H) or 1 (V).
  ComplexRow row_coefficients(int row, int pol) const;
  /// Wide swath row of swath 0-4 and polarisation 0 or 1.
  ComplexRow ws_row_coefficients(int swath, int pol) const;
  /// Gain model: the variable T and the eight coefficients c0-c7.
  float gain_temperature() const;
  std::array<double, 8> gain_coefficients() const;
  /// What the intake takes for one channel of a beam code.
  InsParameters parameters(Timeline timeline, int beam) const;

 private:
  static std::size_t beam_offset(Timeline timeline, int beam, std::size_t imBase, std::size_t apBase,
                                 std::size_t wsBase);
};

/// ASA_XCA: external calibration.
class XcaRecord : public AuxProduct {
 public:
  static XcaRecord read(const std::string& path);
  /// Elevation gains (dB) of a beam slot 1-8 (IM and AP: the swath number; WS: see the wide swath
  /// slots) and polarisation 0-3, 201 values.
  std::array<float, xca::kPatternLength> elevation_gains(int beam, int pol) const;
};

/// ASA_XCH: external characterisation.
class XchRecord : public AuxProduct {
 public:
  static XchRecord read(const std::string& path);
  /// Complex loop factors of polarisation 0 (H) or 1 (V).
  ComplexRow loop_factors(int pol) const;
};

/// FBAQ reconstruction tables of an ASA_INS product. Returns 0.
int LUTfbaq_f(const std::string& insPath, FbaqLut& lutQ, FbaqLut& lutI);

/// Calibration rows of the stripmap modes: seven ASA_INS rows and the ASA_XCH row. Returns 0.
int read_rows(const std::string& insPath, const std::string& xchPath, std::array<ComplexRow, 7>& rows,
              ComplexRow& xchRow, int pol);
/// Wide swath: per swath the product of its ASA_INS row and the ASA_XCH row. Returns 0.
int read_rows_ws(const std::string& insPath, const std::string& xchPath, std::array<ComplexRow, 5>& rows,
                 ComplexRow& xchRow, int pol);

}  // namespace sar::envisat

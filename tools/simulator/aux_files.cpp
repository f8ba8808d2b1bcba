#include "simulator/aux_files.hpp"

#include <algorithm>
#include <bit>
#include <cmath>
#include <cstdint>
#include <cstdlib>
#include <fstream>
#include <iterator>
#include <string>
#include <utility>
#include <stdexcept>
#include <vector>

#include "simulator/fbaq_encoder.hpp"
#include "simulator/header_text.hpp"

namespace sar::simulator {

namespace {

// MPH and SPH positions of an auxiliary product.
constexpr std::size_t kProductNamePos = 9;  // PRODUCT="...", 62 characters
constexpr std::size_t kProductNameWidth = 62;
constexpr std::size_t kSensingStartPos = 351;
constexpr std::size_t kSensingStopPos = 394;
constexpr std::size_t kTimeWidth = 27;
constexpr std::size_t kAuxSphPos = kMphBytes;
constexpr std::size_t kDsOffsetPos = kAuxSphPos + 231;  // DS_OFFSET=+nnnnnnnnnnnnnnnnnnnn
constexpr std::size_t kHeadersBytes = kMphBytes + 378;

// ASA_INS record offsets.
constexpr std::size_t kInsRecordBytes = 171648;
constexpr std::size_t kCarrier = 16;
constexpr std::size_t kSampling = 20;
constexpr std::size_t kGateBias = 69912;
constexpr std::size_t kFbaqI = 74656;
constexpr std::size_t kFbaqQ = 103328;
// Swath tables, + 2 beam each: echoes per burst or block, then rank.
constexpr std::size_t kImEchoes = 161606;
constexpr std::size_t kImRank = 161620;
constexpr std::size_t kApEchoes = 161662;
constexpr std::size_t kApRank = 161676;
constexpr std::size_t kWsEchoes = 161690;
constexpr std::size_t kWsRank = 161704;
constexpr std::size_t kGainT = 171368;
constexpr std::size_t kGainC = 171372;

std::vector<uint8_t> read_all(const std::string& path) {
  std::ifstream in(path, std::ios::binary);
  if (!in) throw std::runtime_error("cannot read the template " + path);
  return {std::istreambuf_iterator<char>(in), std::istreambuf_iterator<char>()};
}

void expect_type(const std::vector<uint8_t>& bytes, const char* prefix, const std::string& path) {
  const std::string name(bytes.begin() + static_cast<std::ptrdiff_t>(std::min(bytes.size(), kProductNamePos)),
                         bytes.begin() + static_cast<std::ptrdiff_t>(std::min(bytes.size(), kProductNamePos + 14)));
  if (bytes.size() < kHeadersBytes || name.rfind(prefix, 0) != 0)
    throw std::runtime_error(path + " is no " + prefix + " product");
}

void put_text(std::vector<uint8_t>& bytes, std::size_t pos, const std::string& text) {
  if (pos + text.size() > bytes.size()) throw std::runtime_error("auxiliary template too short");
  std::copy(text.begin(), text.end(), bytes.begin() + static_cast<std::ptrdiff_t>(pos));
}

void put_be(std::vector<uint8_t>& bytes, std::size_t pos, uint64_t value, int width) {
  if (pos + static_cast<std::size_t>(width) > bytes.size()) throw std::runtime_error("auxiliary record too short");
  for (int k = 0; k < width; ++k)
    bytes[pos + static_cast<std::size_t>(k)] = static_cast<uint8_t>(value >> (8 * (width - 1 - k)));
}
void put_f32(std::vector<uint8_t>& b, std::size_t pos, float v) { put_be(b, pos, std::bit_cast<uint32_t>(v), 4); }
void put_f64(std::vector<uint8_t>& b, std::size_t pos, double v) { put_be(b, pos, std::bit_cast<uint64_t>(v), 8); }
void put_u16(std::vector<uint8_t>& b, std::size_t pos, int v) { put_be(b, pos, static_cast<uint16_t>(v), 2); }

// Renames the product for its new validity and writes it; returns the path.
std::string write_renamed(std::vector<uint8_t>& bytes, const char* prefix, const AuxValidity& v,
                          const std::string& out_dir) {
  const std::string name = std::string(prefix) + "AXVIEC" + compact_time(v.start) + "_" + compact_time(v.start) + "_" +
                           compact_time(v.stop);
  put_text(bytes, kProductNamePos, fit(name, kProductNameWidth));
  put_text(bytes, kSensingStartPos, time_text(v.start));
  put_text(bytes, kSensingStopPos, time_text(v.stop));
  const std::string path = out_dir + "/" + name;
  std::ofstream out(path, std::ios::binary | std::ios::trunc);
  out.write(reinterpret_cast<const char*>(bytes.data()), static_cast<std::streamsize>(bytes.size()));
  out.close();
  if (!out) throw std::runtime_error("cannot write " + path);
  return path;
}

std::size_t record_position(const std::vector<uint8_t>& bytes, std::size_t record_bytes, const std::string& path) {
  const std::string text(bytes.begin() + static_cast<std::ptrdiff_t>(kDsOffsetPos + 1),
                         bytes.begin() + static_cast<std::ptrdiff_t>(kDsOffsetPos + 21));
  char* end = nullptr;
  const unsigned long long pos = std::strtoull(text.c_str(), &end, 10);
  if (end == text.c_str() || pos < kHeadersBytes || pos + record_bytes > bytes.size())
    throw std::runtime_error(path + ": no whole record at DS_OFFSET");
  return static_cast<std::size_t>(pos);
}

// Record offsets of the echoes and rank entries of a row.
std::pair<std::size_t, std::size_t> row_offsets(const InsSwathRow& row) {
  const bool ws = row.table == InsTable::kWs;
  if (ws ? (row.beam < 15 || row.beam > 19) : (row.beam < 1 || row.beam > 7))
    throw std::invalid_argument("beam code " + std::to_string(row.beam) + " outside the ASA_INS swath table");
  const std::size_t b = 2 * static_cast<std::size_t>(row.beam);
  switch (row.table) {
    case InsTable::kIm: return {kImEchoes + b, kImRank + b};
    case InsTable::kAp: return {kApEchoes + b, kApRank + b};
    case InsTable::kWs: return {kWsEchoes + b, kWsRank + b};
  }
  return {0, 0};
}

int get_u16(const std::vector<uint8_t>& bytes, std::size_t pos) {
  if (pos + 2 > bytes.size()) throw std::runtime_error("auxiliary record too short");
  return (bytes[pos] << 8) | bytes[pos + 1];
}

}  // namespace

InsSwathRow read_ins_swath_row(const std::string& ins_path, InsTable table, int beam) {
  const std::vector<uint8_t> bytes = read_all(ins_path);
  expect_type(bytes, "ASA_INS_AX", ins_path);
  const std::size_t r = record_position(bytes, kInsRecordBytes, ins_path);
  InsSwathRow row{table, beam, 0, 0};
  const auto [echoes, rank] = row_offsets(row);
  row.echoes = get_u16(bytes, r + echoes);
  row.rank = get_u16(bytes, r + rank);
  return row;
}

namespace {
constexpr std::size_t kXcaRecordBytes = 26552;
constexpr std::size_t kInsPatternAngle = 161916;  // float, + 4 slot
constexpr long long kXcaPatternBias = 2424;       // the slot's table at 4 (201 (4 slot + pol)) - bias

float get_f32(const std::vector<uint8_t>& bytes, std::size_t pos) {
  if (pos + 4 > bytes.size()) throw std::runtime_error("auxiliary record too short");
  uint32_t v = 0;
  for (std::size_t k = 0; k < 4; ++k) v = (v << 8) | bytes[pos + k];
  return std::bit_cast<float>(v);
}
}  // namespace

double ElevationPattern::amplitude(double look_deg) const {
  const int n = static_cast<int>(gain_db.size());
  const double g = std::clamp((look_deg - centre_deg) / step_deg + (n - 1) / 2, 0.0, n - 1.0);
  const int k = std::min(static_cast<int>(g), n - 2);
  const double db = gain_db[static_cast<std::size_t>(k)] +
                    (g - k) * (gain_db[static_cast<std::size_t>(k + 1)] - gain_db[static_cast<std::size_t>(k)]);
  return std::pow(10.0, db / 20.0);
}

ElevationPattern read_elevation_pattern(const std::string& xca_path, const std::string& ins_path, int slot, int pol) {
  if (slot < 1 || slot > 8 || pol < 0 || pol > 3) throw std::invalid_argument("no elevation pattern slot");
  ElevationPattern p;
  {
    const std::vector<uint8_t> bytes = read_all(xca_path);
    expect_type(bytes, "ASA_XCA_AX", xca_path);
    const std::size_t r = record_position(bytes, kXcaRecordBytes, xca_path);
    const long long first = 4LL * 201 * (4LL * slot + pol) - kXcaPatternBias;
    for (std::size_t k = 0; k < p.gain_db.size(); ++k)
      p.gain_db[k] = get_f32(bytes, r + static_cast<std::size_t>(first) + 4 * k);
  }
  const std::vector<uint8_t> bytes = read_all(ins_path);
  expect_type(bytes, "ASA_INS_AX", ins_path);
  const std::size_t r = record_position(bytes, kInsRecordBytes, ins_path);
  p.centre_deg = get_f32(bytes, r + kInsPatternAngle + 4 * static_cast<std::size_t>(slot));
  // Tables of a negative reference angle are sampled more coarsely.
  p.step_deg = p.centre_deg >= 0.0 ? 0.05 : 0.072;
  return p;
}

AuxValidity aux_validity_around(double sensing_start) {
  const double midnight = std::floor(sensing_start / 86400.0) * 86400.0;
  return {midnight, midnight + 2.0 * 86400.0 - 1.0};
}

std::string write_ins_file(const std::string& template_path, const ImParameters& im, std::span<const InsSwathRow> rows,
                           const AuxValidity& validity, const std::string& out_dir) {
  std::vector<uint8_t> bytes = read_all(template_path);
  expect_type(bytes, "ASA_INS_AX", template_path);
  for (const InsSwathRow& row : rows) {
    (void)row_offsets(row);  // the beam lies in its table
    if (row.echoes > 0xFFFF || row.rank > 0xFFFF) throw std::invalid_argument("ASA_INS swath table entry above 16 bits");
  }
  const std::size_t r = record_position(bytes, kInsRecordBytes, template_path);

  // The decoder reads table row (mapped code) by column (block threshold), rows rising.
  const FbaqTable& table = simulator_fbaq_table();
  for (std::size_t row = 0; row < kFbaqLevels; ++row)
    for (std::size_t col = 0; col < kFbaqColumns; ++col) {
      const std::size_t at = 4 * (row * kFbaqColumns + col);
      put_f32(bytes, r + kFbaqI + at, table.value[row][col]);
      put_f32(bytes, r + kFbaqQ + at, table.value[row][col]);
    }
  // The remaining fields equal the template's for the nominal simulation; written anyway, so a
  // simulation with other values stays consistent.
  put_f32(bytes, r + kCarrier, static_cast<float>(im.carrier_frequency));
  put_f32(bytes, r + kSampling, static_cast<float>(im.sampling_frequency));
  put_f32(bytes, r + kGateBias, static_cast<float>(im.range_gate_bias));
  for (const InsSwathRow& row : rows) {
    const auto [echoes, rank] = row_offsets(row);
    if (row.echoes >= 0) put_u16(bytes, r + echoes, row.echoes);
    if (row.rank >= 0) put_u16(bytes, r + rank, row.rank);
  }
  put_f32(bytes, r + kGainT, static_cast<float>(im.gain_t));
  for (std::size_t k = 0; k < 8; ++k) put_f64(bytes, r + kGainC + 8 * k, im.gain_c[k]);
  return write_renamed(bytes, "ASA_INS_", validity, out_dir);
}

std::string write_xca_file(const std::string& template_path, const AuxValidity& validity,
                           const std::string& out_dir) {
  std::vector<uint8_t> bytes = read_all(template_path);
  expect_type(bytes, "ASA_XCA_AX", template_path);
  return write_renamed(bytes, "ASA_XCA_", validity, out_dir);
}

}  // namespace sar::simulator

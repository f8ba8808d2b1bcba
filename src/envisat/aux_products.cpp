#include "envisat/aux_products.hpp"

#include <charconv>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <stdexcept>
#include <string_view>

#include "base/convert.hpp"
#include "base/errors.hpp"
#include "envisat/detail/be_reader.hpp"
#include "envisat/product_types.hpp"

namespace sar::envisat {
namespace {

using sar::base::fatal;
using sar::base::input_fault;
using sar::base::InputFault;
namespace ec = sar::base::ec;

std::string fmt(const char* format, long long a, long long b = 0, long long c = 0) {
  char text[200];
  std::snprintf(text, sizeof text, format, a, b, c);
  return text;
}

int missing_code(int typeCode) {
  switch (typeCode) {
    case kAsaIns: return ec::kInsMissing;
    case kAsaXca: return ec::kXcaMissing;
    default: return ec::kXchMissing;
  }
}

// A header number such as "+00000000000000001625<bytes>": a sign, then digits up to `width`
// characters. Read without locale; anything else is a broken header.
std::int64_t header_number(const std::string& path, std::string_view headers, std::size_t pos, std::size_t width,
                           const char* field) {
  std::string_view text = headers.substr(pos, width);
  std::size_t start = (!text.empty() && text.front() == '+') ? 1 : 0;
  std::int64_t value = -1;
  const auto [end, err] = std::from_chars(text.data() + start, text.data() + text.size(), value);
  if (err != std::errc{} || end == text.data() + start || value < 0)
    input_fault(InputFault::kMalformed, ec::kFileIo, {path, field,
                        fmt("header byte %lld: not a size: ", static_cast<long long>(pos)) + "\"" +
                            std::string(text) + "\""});
  return value;
}

void size_fault(const std::string& path, const char* field, std::size_t pos, const std::string& what) {
  input_fault(InputFault::kMalformed, ec::kFileIo, {path, field, fmt("header byte %lld: ", static_cast<long long>(pos)) + what});
}

}  // namespace

void AuxProduct::load(const std::string& path, int typeCode, std::size_t recordSize, bool fixedPosition) {
  path_ = path;
  const std::string typeName(product_type_prefix(typeCode));
  std::error_code fsError;
  const auto fileSize = std::filesystem::file_size(path, fsError);
  std::ifstream in(path, std::ios::binary);
  if (fsError || !in) input_fault(InputFault::kMissing, missing_code(typeCode), {path, typeName});

  std::string headers(kAuxHeadersSize, '\0');
  in.read(headers.data(), static_cast<std::streamsize>(headers.size()));
  if (static_cast<std::size_t>(in.gcount()) != headers.size())
    input_fault(InputFault::kTruncated, ec::kFileIo, {path, "MPH/SPH", fmt("file of %lld bytes, headers need %lld", static_cast<long long>(fileSize),
                                             static_cast<long long>(kAuxHeadersSize))});

  // The type is told by the header, as everywhere else in the intake.
  EnvisatTypes types(path);
  if (types.find_type() != typeCode)
    input_fault(InputFault::kWrongType, ec::kBadArguments,
                {typeName, path, "MPH PRODUCT at byte 9: " + types.product_name().value_or("")}, 9, "PRODUCT", path);

  header_.product = types.product_name().value_or("");
  header_.validityStart = headers.substr(kMphSensingStartOffset, kTimeTextLength);
  header_.validityStop = headers.substr(kMphSensingStopOffset, kTimeTextLength);
  header_.totSize = header_number(path, headers, kMphTotSizePos, kMphTotSizeWidth, "MPH TOT_SIZE");
  const std::string_view sph = std::string_view(headers).substr(kMphSize);
  header_.dsOffset = header_number(path, sph, kSphDsOffsetPos, kSphBigWidth, "SPH DS_OFFSET");
  header_.dsSize = header_number(path, sph, kSphDsSizePos, kSphBigWidth, "SPH DS_SIZE");
  header_.numDsr = header_number(path, sph, kSphNumDsrPos, kSphSmallWidth, "SPH NUM_DSR");
  header_.dsrSize = header_number(path, sph, kSphDsrSizePos, kSphSmallWidth, "SPH DSR_SIZE");

  const auto size = static_cast<std::int64_t>(fileSize);
  const auto want = static_cast<std::int64_t>(recordSize);
  if (header_.totSize != size)
    size_fault(path, "MPH TOT_SIZE", kMphTotSizePos, fmt("states %lld bytes, the file has %lld", header_.totSize, size));
  if (header_.dsrSize != want)
    size_fault(path, "SPH DSR_SIZE", kMphSize + kSphDsrSizePos,
               fmt("states %lld bytes, ", header_.dsrSize) + "an " + typeName + fmt(" record has %lld", want));
  if (header_.numDsr < 1 || header_.numDsr > header_.dsSize / want || header_.dsSize != header_.numDsr * want)
    size_fault(path, "SPH DS_SIZE", kMphSize + kSphDsSizePos,
               fmt("%lld bytes do not hold %lld records of %lld bytes", header_.dsSize, header_.numDsr, want));
  if (header_.dsOffset < static_cast<std::int64_t>(kAuxHeadersSize) || header_.dsOffset > size ||
      header_.dsSize > size - header_.dsOffset)
    size_fault(path, "SPH DS_OFFSET", kMphSize + kSphDsOffsetPos,
               fmt("data set at %lld of %lld bytes lies outside a file of %lld bytes", header_.dsOffset,
                   header_.dsSize, size));
  if (fixedPosition && header_.dsOffset != static_cast<std::int64_t>(kXcaRecordPos))
    size_fault(path, "SPH DS_OFFSET", kMphSize + kSphDsOffsetPos,
               fmt("data set at %lld, the record is read at %lld", header_.dsOffset,
                   static_cast<long long>(kXcaRecordPos)));

  record_.assign(recordSize, 0);
  in.seekg(header_.dsOffset);
  in.read(reinterpret_cast<char*>(record_.data()), want);
  if (!in || in.gcount() != want)
    input_fault(InputFault::kTruncated, ec::kFileIo, {path, typeName + " record",
                        fmt("file byte %lld: %lld of %lld bytes read", header_.dsOffset,
                            static_cast<long long>(in.gcount()), want)});
}

double AuxProduct::validity_start() const { return sar::base::ascii2sec85(header_.validityStart); }
double AuxProduct::validity_stop() const { return sar::base::ascii2sec85(header_.validityStop); }

float AuxProduct::f32(std::size_t offset, const char* field) const {
  return detail::BeReader(record_, path_, static_cast<std::uint64_t>(header_.dsOffset)).f32(offset, field);
}
std::uint16_t AuxProduct::u16(std::size_t offset, const char* field) const {
  return detail::BeReader(record_, path_, static_cast<std::uint64_t>(header_.dsOffset)).u16(offset, field);
}
double AuxProduct::f64(std::size_t offset, const char* field) const {
  return detail::BeReader(record_, path_, static_cast<std::uint64_t>(header_.dsOffset)).f64(offset, field);
}
ComplexRow AuxProduct::complex_row(std::size_t offset, const char* field) const {
  const detail::BeReader r(record_, path_, static_cast<std::uint64_t>(header_.dsOffset));
  r.bytes(offset, kRowLength * 8, field);  // the whole row or nothing
  ComplexRow row;
  for (std::size_t k = 0; k < row.size(); ++k) row[k] = {r.f32(offset + 8 * k, field), r.f32(offset + 8 * k + 4, field)};
  return row;
}

// ---------------------------------------------------------------------------------------------
InsRecord InsRecord::read(const std::string& path) {
  InsRecord r;
  r.load(path, kAsaIns, kInsRecordSize, false);
  return r;
}

float InsRecord::carrier_frequency() const { return f32(ins::kCarrierFrequency, "carrier frequency"); }
float InsRecord::sampling_frequency() const { return f32(ins::kSamplingFrequency, "sampling frequency"); }
float InsRecord::range_gate_bias() const { return f32(ins::kRangeGateBias, "range gate bias"); }

FbaqLut InsRecord::lut_i() const {
  FbaqLut lut;
  for (std::size_t k = 0; k < lut.values.size(); ++k) lut.values[k] = f32(ins::kFbaqLutI + 4 * k, "FBAQ table I");
  return lut;
}

FbaqLut InsRecord::lut_q() const {
  FbaqLut lut;
  for (std::size_t k = 0; k < lut.values.size(); ++k) lut.values[k] = f32(ins::kFbaqLutQ + 4 * k, "FBAQ table Q");
  return lut;
}

std::size_t InsRecord::beam_offset(Timeline timeline, int beam, std::size_t imBase, std::size_t apBase,
                                   std::size_t wsBase) {
  const bool ws = timeline == Timeline::kWs;
  const int lo = ws ? 15 : 1;
  const int hi = ws ? 19 : 7;
  if (beam < lo || beam > hi) throw std::out_of_range(fmt("beam code %lld outside %lld-%lld", beam, lo, hi));
  const std::size_t base = timeline == Timeline::kIm ? imBase : timeline == Timeline::kAp ? apBase : wsBase;
  return base + 2 * static_cast<std::size_t>(beam);
}

int InsRecord::burst_echoes(Timeline timeline, int beam) const {
  return u16(beam_offset(timeline, beam, ins::kImBurstEchoes, ins::kApBlockEchoes, ins::kWsBurstEchoes),
             "echoes per burst");
}

int InsRecord::swath_rank(Timeline timeline, int beam) const {
  return u16(beam_offset(timeline, beam, ins::kImRank, ins::kApRank, ins::kWsRank), "swath rank");
}

float InsRecord::pattern_reference_angle(int beam) const {
  if (beam < 1 || beam > 19) throw std::out_of_range(fmt("beam code %lld outside 1-19", beam));
  return f32(ins::kPatternReferenceAngle + 4 * static_cast<std::size_t>(beam), "pattern reference angle");
}

namespace {
void check_pol(int pol) {
  if (pol < 0 || pol > 1) throw std::out_of_range(fmt("polarisation %lld outside 0-1", pol));
}
}  // namespace

ComplexRow InsRecord::row_coefficients(int row, int pol) const {
  if (row < 0 || row > 6) throw std::out_of_range(fmt("row %lld outside 0-6", row));
  check_pol(pol);
  return complex_row(ins::kRowCoefficients + ins::kRowStride * static_cast<std::size_t>(row) +
                         static_cast<std::size_t>(kPolStride * pol),
                     "row excitation coefficients");
}

ComplexRow InsRecord::ws_row_coefficients(int swath, int pol) const {
  if (swath < 0 || swath > 4) throw std::out_of_range(fmt("swath %lld outside 0-4", swath));
  check_pol(pol);
  return complex_row(ins::kWsRowCoefficients[static_cast<std::size_t>(swath)] + static_cast<std::size_t>(kPolStride * pol),
                     "wide swath row coefficients");
}

float InsRecord::gain_temperature() const { return f32(ins::kGainTemperature, "gain model T"); }

std::array<double, 8> InsRecord::gain_coefficients() const {
  std::array<double, 8> c{};
  for (std::size_t k = 0; k < c.size(); ++k) c[k] = f64(ins::kGainCoefficients + 8 * k, "gain model coefficients");
  return c;
}

InsParameters InsRecord::parameters(Timeline timeline, int beam) const {
  InsParameters p;
  p.carrierFrequency = carrier_frequency();
  p.samplingFrequency = sampling_frequency();
  p.rangeGateBias = range_gate_bias();
  p.burstEchoes = burst_echoes(timeline, beam);
  p.swathRank = swath_rank(timeline, beam);
  return p;
}

// ---------------------------------------------------------------------------------------------
XcaRecord XcaRecord::read(const std::string& path) {
  XcaRecord r;
  r.load(path, kAsaXca, kXcaRecordSize, true);
  return r;
}

std::array<float, xca::kPatternLength> XcaRecord::elevation_gains(int beam, int pol) const {
  if (pol < 0 || pol > 3) throw std::out_of_range(fmt("polarisation %lld outside 0-3", pol));
  const std::int64_t first = 4 * (std::int64_t{xca::kPatternLength} * (4 * std::int64_t{beam} + pol)) - xca::kPatternBias;
  const std::int64_t end = first + 4 * xca::kPatternLength;
  if (beam < 1 || beam > 8 || first < 0 || end > static_cast<std::int64_t>(kXcaRecordSize))
    throw std::out_of_range(fmt("beam %lld, polarisation %lld: no elevation pattern", beam, pol));
  std::array<float, xca::kPatternLength> gains{};
  for (std::size_t k = 0; k < gains.size(); ++k)
    gains[k] = f32(static_cast<std::size_t>(first) + 4 * k, "elevation pattern");
  return gains;
}

// ---------------------------------------------------------------------------------------------
XchRecord XchRecord::read(const std::string& path) {
  XchRecord r;
  r.load(path, kAsaXch, kXchRecordSize, false);
  return r;
}

ComplexRow XchRecord::loop_factors(int pol) const {
  check_pol(pol);
  return complex_row(xch::kLoopFactors + static_cast<std::size_t>(kPolStride * pol), "loop factors");
}

// ---------------------------------------------------------------------------------------------
int LUTfbaq_f(const std::string& insPath, FbaqLut& lutQ, FbaqLut& lutI) {
  const InsRecord ins = InsRecord::read(insPath);
  lutQ = ins.lut_q();
  lutI = ins.lut_i();
  return 0;
}

int read_rows(const std::string& insPath, const std::string& xchPath, std::array<ComplexRow, 7>& rows,
              ComplexRow& xchRow, int pol) {
  const InsRecord ins = InsRecord::read(insPath);
  const XchRecord xchRecord = XchRecord::read(xchPath);
  for (int r = 0; r < 7; ++r) rows[static_cast<std::size_t>(r)] = ins.row_coefficients(r, pol);
  xchRow = xchRecord.loop_factors(pol);
  return 0;
}

int read_rows_ws(const std::string& insPath, const std::string& xchPath, std::array<ComplexRow, 5>& rows,
                 ComplexRow& xchRow, int pol) {
  const InsRecord ins = InsRecord::read(insPath);
  const XchRecord xchRecord = XchRecord::read(xchPath);
  xchRow = xchRecord.loop_factors(pol);
  for (int s = 0; s < 5; ++s) {
    const ComplexRow f = ins.ws_row_coefficients(s, pol);
    for (std::size_t k = 0; k < f.size(); ++k) rows[static_cast<std::size_t>(s)][k] = f[k] * xchRow[k];
  }
  return 0;
}

}  // namespace sar::envisat

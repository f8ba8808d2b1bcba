#include "envisat/level1.hpp"

#include <algorithm>
#include <cctype>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <limits>

#include "base/convert.hpp"
#include "envisat/product_types.hpp"

namespace sar::envisat {

namespace {

constexpr int kRejected = 10;

// MPH positions (value starts).
constexpr std::size_t kMphTotSize = 1075;
constexpr std::size_t kMphSphSize = 1113;
constexpr std::size_t kMphNumDsd = 1140;
constexpr std::size_t kMphDsdSize = 1161;

// SPH positions (value starts), the same in every ASAR level 1 product.
constexpr std::size_t kSphDescriptor = 16;
constexpr std::size_t kSphFirstLineTime = 135;
constexpr std::size_t kSphLastLineTime = 180;
constexpr std::size_t kSphSwath = 688;
constexpr std::size_t kSphPass = 699;
constexpr std::size_t kSphSampleType = 724;
constexpr std::size_t kSphPolar1 = 772;
constexpr std::size_t kSphPolar2 = 795;
constexpr std::size_t kSphRangeSpacing = 870;
constexpr std::size_t kSphAzimuthSpacing = 905;
constexpr std::size_t kSphLineTimeInterval = 943;
constexpr std::size_t kSphLineLength = 974;
constexpr std::size_t kSphDataType = 1001;
constexpr std::size_t kSphFieldsEnd = 1010;

// DSD positions.
constexpr std::size_t kDsdName = 9;
constexpr std::size_t kDsdNameLength = 28;
constexpr std::size_t kDsdType = 47;
constexpr std::size_t kDsdFilename = 59;
constexpr std::size_t kDsdFilenameLength = 62;
constexpr std::size_t kDsdOffset = 133;
constexpr std::size_t kDsdDsSize = 170;
constexpr std::size_t kDsdNumDsr = 207;
constexpr std::size_t kDsdDsrSize = 228;

constexpr int64_t kMppMinimumSize = 69;
constexpr int64_t kMostAnnotationBytes = int64_t{64} << 20;

std::string trimmed(std::string_view s) {
  std::size_t b = 0, e = s.size();
  while (b < e && (s[b] == ' ' || s[b] == '\0')) ++b;
  while (e > b && (s[e - 1] == ' ' || s[e - 1] == '\0' || s[e - 1] == '"')) --e;
  return std::string(s.substr(b, e - b));
}

/// Text up to the closing quote of a quoted value.
std::string quoted(std::string_view text, std::size_t at, std::size_t most) {
  if (at >= text.size()) return {};
  std::string_view v = text.substr(at, most);
  v = v.substr(0, v.find('"'));
  return trimmed(v);
}

/// A signed whole number ("+000123<bytes>"); false when there are no digits.
bool whole_at(std::string_view text, std::size_t at, int64_t& value) {
  if (at >= text.size()) return false;
  std::size_t i = at;
  bool negative = false;
  if (text[i] == '+' || text[i] == '-') negative = text[i++] == '-';
  int64_t v = 0;
  std::size_t digits = 0;
  for (; i < text.size() && std::isdigit(static_cast<unsigned char>(text[i])); ++i, ++digits) {
    if (v > (std::numeric_limits<int64_t>::max() - 9) / 10) return false;
    v = v * 10 + (text[i] - '0');
  }
  if (digits == 0) return false;
  value = negative ? -v : v;
  return true;
}

bool real_at(std::string_view text, std::size_t at, double& value) {
  if (at >= text.size()) return false;
  const std::string s(text.substr(at, 24));
  char* end = nullptr;
  value = std::strtod(s.c_str(), &end);
  return end != s.c_str();
}

const unsigned char* bytes(const std::string& s, std::size_t at) {
  return reinterpret_cast<const unsigned char*>(s.data()) + at;
}

bool read_at(std::ifstream& in, int64_t offset, int64_t length, std::string& out) {
  out.assign(static_cast<std::size_t>(length), '\0');
  in.clear();
  in.seekg(offset);
  in.read(out.data(), length);
  return in.gcount() == length;
}

int reject(std::string& error, std::string text) {
  error = std::move(text);
  return kRejected;
}

/// The records of one annotation data set, checked against the file and the record size the
/// caller needs at least.
int data_set(std::ifstream& in, const Level1Product& p, std::string_view name, int64_t minimumRecord,
             std::string& data, const Dsd*& dsd, std::string& error) {
  dsd = p.find(name);
  if (!dsd) return reject(error, std::string("no ") + std::string(name) + " in the DSDs of " + p.path);
  if (!dsd->present()) return 0;
  if (dsd->recordSize < minimumRecord || dsd->count < 0 || dsd->offset < 0 ||
      dsd->size != dsd->count * dsd->recordSize || dsd->size > kMostAnnotationBytes)
    return reject(error, std::string(name) + ": record size or count out of range in " + p.path);
  if (dsd->offset + dsd->size > p.fileSize)
    return reject(error, std::string(name) + ": the data set is shorter than its DSD says in " + p.path);
  if (!read_at(in, dsd->offset, dsd->size, data)) return reject(error, "cannot read " + std::string(name));
  return 0;
}

}  // namespace

int GeolocationRecord::subSwath() const {
  if (swath.size() == 3 && swath[0] == 'S' && swath[1] == 'S' && swath[2] >= '1' && swath[2] <= '5')
    return swath[2] - '0';
  return 0;
}

const Dsd* Level1Product::find(std::string_view name) const {
  const std::string wanted = trimmed(name);
  for (const auto& d : dsds)
    if (d.name == wanted) return &d;
  return nullptr;
}

std::vector<const Dsd*> Level1Product::measurements() const {
  std::vector<const Dsd*> out;
  for (const auto& d : dsds)
    if (d.type == 'M' && d.present()) out.push_back(&d);
  return out;
}

const GeolocationRecord* Level1Product::geolocation_of(int subSwath) const {
  for (const auto& g : geolocation)
    if (g.subSwath() == subSwath) return &g;
  return nullptr;
}

int read_level1(const std::string& path, Level1Product& p, std::string& error) {
  p = {};
  p.path = path;
  std::error_code ec;
  const auto size = std::filesystem::file_size(path, ec);
  std::ifstream in(path, std::ios::binary);
  if (ec || !in) {
    error = "cannot read " + path;
    return 1;
  }
  p.fileSize = static_cast<int64_t>(size);
  std::string mph;
  if (!read_at(in, 0, static_cast<int64_t>(kMphSize), mph)) return reject(error, path + " is shorter than its MPH");
  p.product = quoted(mph, kMphProductOffset, kMphProductLength);
  if (p.product.size() < 10 || p.product.compare(0, 4, "ASA_") != 0 || p.product.compare(7, 3, "_1P") != 0)
    return reject(error, path + " is no ASAR level 1 product (" + p.product + ")");
  p.kind = trimmed(std::string_view(p.product).substr(4, 3));
  while (!p.kind.empty() && p.kind.back() == '_') p.kind.pop_back();
  p.sensingStart = base::ascii2sec85(mph.substr(kMphSensingStartOffset, kTimeTextLength));
  p.sensingStop = base::ascii2sec85(mph.substr(kMphSensingStopOffset, kTimeTextLength));
  int64_t numDsd = 0, dsdSize = 0;
  if (!whole_at(mph, kMphTotSize, p.totalSize) || !whole_at(mph, kMphSphSize, p.sphSize) ||
      !whole_at(mph, kMphNumDsd, numDsd) || !whole_at(mph, kMphDsdSize, dsdSize))
    return reject(error, "the MPH of " + path + " has no data set sizes");
  if (dsdSize != kDsdSize || numDsd < 1 || numDsd * kDsdSize > p.sphSize ||
      p.sphSize < static_cast<int64_t>(kSphFieldsEnd) + numDsd * kDsdSize || p.sphSize > kMostAnnotationBytes)
    return reject(error, "the MPH of " + path + " gives impossible SPH or DSD sizes");
  std::string sph;
  if (!read_at(in, static_cast<int64_t>(kMphSize), p.sphSize, sph))
    return reject(error, path + " is shorter than its SPH (" + std::to_string(p.sphSize) + " bytes)");

  p.descriptor = quoted(sph, kSphDescriptor, 28);
  p.firstLineTime = base::ascii2sec85(sph.substr(kSphFirstLineTime, kTimeTextLength));
  p.lastLineTime = base::ascii2sec85(sph.substr(kSphLastLineTime, kTimeTextLength));
  p.swath = quoted(sph, kSphSwath, 3);
  p.pass = quoted(sph, kSphPass, 10);
  p.sampleType = quoted(sph, kSphSampleType, 8);
  p.polarisation1 = quoted(sph, kSphPolar1, 3);
  p.polarisation2 = quoted(sph, kSphPolar2, 3);
  p.dataType = quoted(sph, kSphDataType, 5);
  int64_t lineLength = 0;
  if (!real_at(sph, kSphRangeSpacing, p.rangeSpacing) || !real_at(sph, kSphAzimuthSpacing, p.azimuthSpacing) ||
      !real_at(sph, kSphLineTimeInterval, p.lineTimeInterval) || !whole_at(sph, kSphLineLength, lineLength) ||
      lineLength < 0 || lineLength > std::numeric_limits<int>::max())
    return reject(error, "the SPH of " + path + " has no image geometry");
  p.lineLength = static_cast<int>(lineLength);
  if (p.dataType == "SWORD" || p.dataType == "UWORD")
    p.cellType = "SHORT";
  else if (p.dataType == "BYTE")
    p.cellType = "BYTE";
  else
    return reject(error, "data type '" + p.dataType + "' of " + path + " is not supported");

  const std::size_t first = static_cast<std::size_t>(p.sphSize - numDsd * kDsdSize);
  for (int64_t i = 0; i < numDsd; ++i) {
    const std::string_view d = std::string_view(sph).substr(first + static_cast<std::size_t>(i * kDsdSize), kDsdSize);
    if (d.compare(0, 8, "DS_NAME=") != 0) return reject(error, "DSD " + std::to_string(i + 1) + " of " + path + " is corrupt");
    Dsd dsd;
    dsd.name = trimmed(d.substr(kDsdName, kDsdNameLength));
    dsd.type = d[kDsdType];
    dsd.filename = trimmed(d.substr(kDsdFilename, kDsdFilenameLength));
    if (!whole_at(d, kDsdOffset, dsd.offset) || !whole_at(d, kDsdDsSize, dsd.size) ||
        !whole_at(d, kDsdNumDsr, dsd.count) || !whole_at(d, kDsdDsrSize, dsd.recordSize) || dsd.offset < 0 ||
        dsd.size < 0 || dsd.count < 0 || dsd.recordSize < 0)
      return reject(error, "DSD " + dsd.name + " of " + path + " is corrupt");
    p.dsds.push_back(std::move(dsd));
  }

  std::string data;
  const Dsd* dsd = nullptr;
  if (int st = data_set(in, p, kMppName, kMppMinimumSize, data, dsd, error)) return st;
  if (!dsd->present()) return reject(error, "WARNING: A number of 0 MPP is not supported!");
  for (int64_t r = 0; r < dsd->count; ++r) {
    const std::size_t o = static_cast<std::size_t>(r * dsd->recordSize);
    MppRecord m;
    m.firstTime = base::mjd2sec85(bytes(data, o));
    m.lastTime = base::mjd2sec85(bytes(data, o + 13));
    m.swath = trimmed(std::string_view(data).substr(o + 41, 3));
    m.rangeSpacing = base::ch2float4(bytes(data, o + 44), 'm');
    m.azimuthSpacing = base::ch2float4(bytes(data, o + 48), 'm');
    m.lineTimeInterval = base::ch2float4(bytes(data, o + 52), 'm');
    m.lines = base::ch2uint4(bytes(data, o + 56), 'm');
    m.samples = base::ch2uint4(bytes(data, o + 60), 'm');
    m.dataType = trimmed(std::string_view(data).substr(o + 64, 5));
    p.mpp.push_back(std::move(m));
  }
  if (int st = data_set(in, p, kDccName, kDccRecordSize, data, dsd, error)) return st;
  if (!dsd->present()) return reject(error, "WARINING: A number of 0 DCC is not supported!");
  for (int64_t r = 0; r < dsd->count; ++r) {
    const std::size_t o = static_cast<std::size_t>(r * dsd->recordSize);
    DccRecord c;
    c.time = base::mjd2sec85(bytes(data, o));
    c.slantRangeTime = base::ch2float4(bytes(data, o + 13), 'm') * 1e-9;
    for (std::size_t k = 0; k < 5; ++k) c.coefficients[k] = base::ch2float4(bytes(data, o + 17 + 4 * k), 'm');
    c.confidence = base::ch2float4(bytes(data, o + 37), 'm');
    c.belowThreshold = static_cast<unsigned char>(data[o + 41]);
    p.dcc.push_back(c);
  }
  if (int st = data_set(in, p, kGeolocationName, kGeolocationRecordSize, data, dsd, error)) return st;
  for (int64_t r = 0; r < dsd->count && dsd->present(); ++r) {
    const std::size_t o = static_cast<std::size_t>(r * dsd->recordSize);
    GeolocationRecord g;
    g.firstTime = base::mjd2sec85(bytes(data, o));
    g.lineNumber = base::ch2uint4(bytes(data, o + 13), 'm');
    g.lines = base::ch2uint4(bytes(data, o + 17), 'm');
    g.firstSample = base::ch2uint4(bytes(data, o + 25), 'm');
    g.firstSlantTime = base::ch2float4(bytes(data, o + 69), 'm') * 1e-9;
    g.firstIncidence = base::ch2float4(bytes(data, o + 113), 'm');
    g.firstLatitude = base::ch2int4(bytes(data, o + 157), 'm') * 1e-6;
    g.firstLongitude = base::ch2int4(bytes(data, o + 201), 'm') * 1e-6;
    g.swath = trimmed(std::string_view(data).substr(o + 499, 3));
    p.geolocation.push_back(std::move(g));
  }

  if (p.kind == "WSS")
    p.channels = 5;
  else if (p.kind == "APS" || p.kind == "APP" || p.kind == "APM")
    p.channels = 2;
  else if (p.kind == "WSM")
    p.channels = 1;
  else
    p.channels = static_cast<int>(p.mpp.size());
  return 0;
}

int check_measurements(const Level1Product& p, std::string& error) {
  const auto mds = p.measurements();
  if (mds.empty()) return reject(error, "no measurement data set in " + p.path);
  for (const Dsd* d : mds) {
    if (d->recordSize <= kMdsRowPrefix || d->size != d->count * d->recordSize)
      return reject(error, d->name + ": record size or count out of range in " + p.path);
    if (d->offset >= p.fileSize) return reject(error, d->name + " is missing from " + p.path);
    if (d->offset + d->size > p.fileSize)
      return reject(error, d->name + " is shorter than its DSD says in " + p.path + " (" +
                               std::to_string(p.fileSize - d->offset) + " of " + std::to_string(d->size) + " bytes)");
  }
  return 0;
}

int check_wss_layout(const Level1Product& p, std::string& error) {
  if (p.kind != "WSS") return reject(error, p.path + " is no ASA_WSS_1P product");
  for (int s = 1; s <= 5; ++s) {
    const std::string name = "MDS" + std::to_string(s);
    const Dsd* d = p.find(name);
    if (!d || !d->present()) return reject(error, "sub-swath " + std::to_string(s) + " (" + name + ") is missing from " + p.path);
    if (!p.geolocation_of(s)) return reject(error, "no geolocation record of sub-swath SS" + std::to_string(s) + " in " + p.path);
  }
  if (p.mpp.size() < 5) return reject(error, "WSS product " + p.path + " has " + std::to_string(p.mpp.size()) + " MPP records, not 5");
  return 0;
}

}  // namespace sar::envisat

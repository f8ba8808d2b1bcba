#include "geometry/orbit_file.hpp"

#include <algorithm>
#include <array>
#include <cctype>
#include <charconv>
#include <cmath>
#include <cstdio>
#include <fstream>
#include <optional>

#include "base/convert.hpp"
#include "base/diagnostics.hpp"

namespace sar::geometry {

namespace {
base::InputFault fault_of(int status) {
  switch (status) {
    case orbit_status::kNotOrbitProduct: return base::InputFault::kWrongType;
    case orbit_status::kOutsideSpan: return base::InputFault::kNotCovering;
    case orbit_status::kFileIo: return base::InputFault::kMissing;
    default: return base::InputFault::kMalformed;
  }
}
// The record shows the file and the text apart; the text repeats the file in front.
std::string without_file(const std::string& what, const std::string& file) {
  const std::string prefix = file + ": ";
  return what.rfind(prefix, 0) == 0 ? what.substr(prefix.size()) : what;
}
int32_t host_code_of(int status) {
  switch (status) {
    case orbit_status::kNotOrbitProduct: return base::ec::kBadArguments;
    case orbit_status::kOutsideSpan: return base::ec::kStageFailed;
    default: return base::ec::kFileIo;
  }
}
}  // namespace

OrbitError::OrbitError(int status, std::string file, int64_t offset, std::string field, const std::string& what)
    : base::InputError(fault_of(status), host_code_of(status), {file, without_file(what, file)}, offset,
                       std::move(field), what),
      status_(status) {}

namespace {

// Layout of the ENVISAT-format orbit products.
constexpr int64_t kMphSize = 1247;
constexpr int64_t kSphSize = 378;
constexpr int64_t kProductNameOffset = 9;
constexpr int64_t kProductNameSize = 10;
constexpr int64_t kSensingStartOffset = 351;
constexpr int64_t kSensingStopOffset = 394;
constexpr int64_t kTimeTextSize = 27;
constexpr int64_t kDataOffsetField = 231;   // in the SPH
constexpr int64_t kRecordCountField = 305;  // in the SPH
constexpr int64_t kRecordSize = 129;
constexpr int64_t kRecOrbit = 37;
constexpr std::array<int64_t, 6> kRecVectorFields = {44, 57, 70, 83, 96, 109};
constexpr std::array<const char*, 6> kRecVectorNames = {"X position", "Y position", "Z position",
                                                        "X velocity", "Y velocity", "Z velocity"};

// Orbit files are a few hundred kilobytes; anything far beyond is refused before it is read.
constexpr std::uintmax_t kMaxOrbitFileBytes = 256u << 20;

[[noreturn]] void fail(int status, const std::string& file, int64_t offset, const std::string& field,
                       const std::string& text) {
  std::string what = file + ": " + text;
  if (!field.empty()) what += " (field " + field + ")";
  if (offset >= 0) what += " at byte " + std::to_string(offset);
  throw OrbitError(status, file, offset, field, what);
}

std::string read_whole_file(const std::filesystem::path& path) {
  const std::string name = path.string();
  std::error_code ec;
  const std::uintmax_t size = std::filesystem::file_size(path, ec);
  if (ec) fail(orbit_status::kFileIo, name, -1, "", "cannot open the orbit file");
  if (size > kMaxOrbitFileBytes) fail(orbit_status::kFileIo, name, -1, "", "orbit file too large");
  std::ifstream in(path, std::ios::binary);
  if (!in) fail(orbit_status::kFileIo, name, -1, "", "cannot open the orbit file");
  std::string bytes(static_cast<std::size_t>(size), '\0');
  in.read(bytes.data(), static_cast<std::streamsize>(size));
  if (static_cast<std::uintmax_t>(in.gcount()) != size)
    fail(orbit_status::kFileIo, name, -1, "", "cannot read the orbit file");
  return bytes;
}

/// "%ld"-like: blanks, an optional sign, at least one digit; stops at the first non-digit.
std::optional<int64_t> scan_integer(std::string_view text) {
  std::size_t i = 0;
  while (i < text.size() && (text[i] == ' ' || text[i] == '\t')) ++i;
  bool negative = false;
  if (i < text.size() && (text[i] == '+' || text[i] == '-')) negative = text[i++] == '-';
  const std::size_t first = i;
  int64_t value = 0;
  while (i < text.size() && std::isdigit(static_cast<unsigned char>(text[i]))) {
    if (value > (INT64_MAX - 9) / 10) return std::nullopt;
    value = value * 10 + (text[i] - '0');
    ++i;
  }
  if (i == first) return std::nullopt;
  return negative ? -value : value;
}

/// "%lf"-like on one blank-delimited token, without the locale: blanks, an optional sign,
/// then a decimal number that must fill the token and be finite.
std::optional<double> scan_real(std::string_view text) {
  std::size_t i = 0;
  while (i < text.size() && (text[i] == ' ' || text[i] == '\t')) ++i;
  std::size_t end = i;
  while (end < text.size() && text[end] != ' ' && text[end] != '\t' && text[end] != '\n' && text[end] != '\r') ++end;
  std::string_view token = text.substr(i, end - i);
  bool negative = false;
  if (!token.empty() && (token[0] == '+' || token[0] == '-')) {
    negative = token[0] == '-';
    token.remove_prefix(1);
  }
  if (token.empty() || token[0] == '+' || token[0] == '-') return std::nullopt;
  double value = 0.0;
  const auto [ptr, err] = std::from_chars(token.data(), token.data() + token.size(), value);
  if (err != std::errc{} || ptr != token.data() + token.size() || !std::isfinite(value)) return std::nullopt;
  return negative ? -value : value;
}

/// sec85 of a 27-character time text, or nothing when the text is not a valid time.
std::optional<double> scan_time(std::string_view text) {
  if (text.size() < 11 || !std::isdigit(static_cast<unsigned char>(text[0])) || text[2] != '-' || text[6] != '-')
    return std::nullopt;
  base::DateParts parts;
  if (base::date2str(text, parts) != 0) return std::nullopt;
  return base::ascii2sec85(text);
}

void check_increasing(const OrbitData& data, const std::string& name, int64_t base, int64_t stride) {
  for (std::size_t k = 1; k < data.vectors.size(); ++k)
    if (!(data.vectors[k].time > data.vectors[k - 1].time))
      fail(orbit_status::kMalformed, name, base + static_cast<int64_t>(k) * stride, "epoch",
           "epochs do not increase at record " + std::to_string(k));
}

}  // namespace

bool is_orbit_product_name(std::string_view name10) {
  static constexpr std::array<std::string_view, 4> kNames = {"DOR_VOR_AX", "DOR_POR_AX", "AUX_FRO_AX", "AUX_FPO_AX"};
  for (auto n : kNames)
    if (name10 == n) return true;
  return false;
}

OrbitData parse_envisat_orbit(std::string_view bytes, const std::string& name) {
  const auto size = static_cast<int64_t>(bytes.size());
  // The type check is quiet and needs only the name; a short file of the right type is truncated.
  if (size < kProductNameOffset + kProductNameSize ||
      !is_orbit_product_name(bytes.substr(kProductNameOffset, kProductNameSize)))
    fail(orbit_status::kNotOrbitProduct, name, kProductNameOffset, "PRODUCT", "not an orbit product");
  if (size < kMphSize + kSphSize)
    fail(orbit_status::kFileIo, name, size, "SPH", "file truncated inside the product headers");

  OrbitData data;
  data.family = OrbitFamily::kEnvisat;
  data.path = name;
  data.product_name = std::string(bytes.substr(kProductNameOffset, kProductNameSize));

  const auto start = scan_time(bytes.substr(kSensingStartOffset, kTimeTextSize));
  if (!start) fail(orbit_status::kMalformed, name, kSensingStartOffset, "SENSING_START", "bad time text");
  const auto stop = scan_time(bytes.substr(kSensingStopOffset, kTimeTextSize));
  if (!stop) fail(orbit_status::kMalformed, name, kSensingStopOffset, "SENSING_STOP", "bad time text");
  data.sensing_start = *start;
  data.sensing_stop = *stop;

  const std::string_view sph = bytes.substr(kMphSize, kSphSize);
  const auto offset = scan_integer(sph.substr(kDataOffsetField, 40));
  if (!offset) fail(orbit_status::kMalformed, name, kMphSize + kDataOffsetField, "DS_OFFSET", "bad number");
  const auto count = scan_integer(sph.substr(kRecordCountField, 20));
  if (!count) fail(orbit_status::kMalformed, name, kMphSize + kRecordCountField, "NUM_DSR", "bad number");
  if (*offset < 0 || *offset > size)
    fail(orbit_status::kFileIo, name, kMphSize + kDataOffsetField, "DS_OFFSET", "data offset beyond the file end");
  if (*count <= 0 || *count > INT32_MAX)
    fail(orbit_status::kMalformed, name, kMphSize + kRecordCountField, "NUM_DSR", "bad record count");
  // Both operands are below 2^31 and the product fits 64 bits; compare against the bytes left.
  if (*count * kRecordSize > size - *offset)
    fail(orbit_status::kFileIo, name, kMphSize + kRecordCountField, "NUM_DSR",
         "record count larger than the file holds (" + std::to_string(*count) + " records)");

  data.vectors.resize(static_cast<std::size_t>(*count));
  for (int64_t k = 0; k < *count; ++k) {
    const int64_t at = *offset + k * kRecordSize;
    const std::string_view rec = bytes.substr(static_cast<std::size_t>(at), kRecordSize);
    StateVector& sv = data.vectors[static_cast<std::size_t>(k)];
    const auto epoch = scan_time(rec.substr(0, kTimeTextSize));
    if (!epoch) fail(orbit_status::kMalformed, name, at, "epoch", "bad time text in record " + std::to_string(k));
    sv.time = *epoch;
    const auto orbit = scan_integer(rec.substr(kRecOrbit, kRecVectorFields[0] - kRecOrbit));
    if (!orbit || *orbit < INT32_MIN || *orbit > INT32_MAX)
      fail(orbit_status::kMalformed, name, at + kRecOrbit, "absolute orbit", "bad number in record " + std::to_string(k));
    sv.orbit_number = static_cast<int>(*orbit);
    for (std::size_t f = 0; f < kRecVectorFields.size(); ++f) {
      const auto value = scan_real(rec.substr(static_cast<std::size_t>(kRecVectorFields[f])));
      if (!value)
        fail(orbit_status::kMalformed, name, at + kRecVectorFields[f], kRecVectorNames[f],
             "bad number in record " + std::to_string(k));
      (f < 3 ? sv.position[f] : sv.velocity[f - 3]) = *value;
    }
  }
  check_increasing(data, name, *offset, kRecordSize);
  return data;
}

OrbitData read_envisat_orbit(const std::filesystem::path& path) {
  return parse_envisat_orbit(read_whole_file(path), path.string());
}

// ---------------------------------------------------------------------------------------------
// Text orbit

namespace {

struct Line {
  std::string_view text;
  int64_t offset;
};

std::vector<Line> split_lines(std::string_view bytes) {
  std::vector<Line> lines;
  std::size_t pos = 0;
  while (pos < bytes.size()) {
    std::size_t end = bytes.find('\n', pos);
    if (end == std::string_view::npos) end = bytes.size();
    std::string_view text = bytes.substr(pos, end - pos);
    if (!text.empty() && text.back() == '\r') text.remove_suffix(1);
    lines.push_back({text, static_cast<int64_t>(pos)});
    pos = end + 1;
  }
  return lines;
}

bool blank(std::string_view text) {
  for (char c : text)
    if (c != ' ' && c != '\t') return false;
  return true;
}

/// Three numbers of a record line: blank-separated, digits, '.', '-' (a '+' is let through).
std::optional<Vec3> scan_triplet(std::string_view text) {
  Vec3 out{};
  std::size_t pos = 0;
  for (int axis = 0; axis < 3; ++axis) {
    while (pos < text.size() && (text[pos] == ' ' || text[pos] == '\t')) ++pos;
    std::size_t end = pos;
    while (end < text.size() && text[end] != ' ' && text[end] != '\t') ++end;
    const auto value = scan_real(text.substr(pos, end - pos));
    if (!value) return std::nullopt;
    out[static_cast<std::size_t>(axis)] = *value;
    pos = end;
  }
  return out;
}

std::optional<int> digits(std::string_view text, std::size_t at, std::size_t count) {
  if (at + count > text.size()) return std::nullopt;
  int value = 0;
  for (std::size_t i = at; i < at + count; ++i) {
    if (!std::isdigit(static_cast<unsigned char>(text[i]))) return std::nullopt;
    value = value * 10 + (text[i] - '0');
  }
  return value;
}

}  // namespace

OrbitData parse_text_orbit(std::string_view bytes, const std::string& name) {
  const std::vector<Line> all = split_lines(bytes);
  std::vector<Line> lines;  // comments and blank lines dropped
  for (const Line& l : all)
    if (!(l.text.empty() || l.text[0] == ';' || blank(l.text))) lines.push_back(l);

  struct Expect {
    char first;
    const char* message;
  };
  static constexpr std::array<Expect, 5> kHeader = {{{'G', "GENERATION TIME not found in the Orbit file"},
                                                     {'O', "ORBIT NUMBER not found in the Orbit file"},
                                                     {'G', "GREENWICH ANGLE not found in the Orbit file"},
                                                     {'1', "FIRST MODEL not found in the Orbit file"},
                                                     {'2', "SECOND MODEL not found in the Orbit file"}}};
  for (std::size_t i = 0; i < kHeader.size(); ++i) {
    // These texts are the system's own messages and stand alone; the file is in the error.
    if (i >= lines.size() || lines[i].text[0] != kHeader[i].first)
      throw OrbitError(orbit_status::kNoNodeOrHeader, name, i < lines.size() ? lines[i].offset : -1, "",
                       kHeader[i].message);
  }

  OrbitData data;
  data.family = OrbitFamily::kTextOrbit;
  data.path = name;
  data.product_name = "TEXT_ORBIT";

  // The Greenwich angle stands 17 characters behind the 'G'; blanks inside are dropped.
  constexpr std::size_t kAngleColumn = 17;
  const Line& angleLine = lines[2];
  std::string angle;
  for (std::size_t i = kAngleColumn; i < angleLine.text.size(); ++i)
    if (angleLine.text[i] != ' ' && angleLine.text[i] != '\t') angle += angleLine.text[i];
  const auto g0 = scan_real(angle);
  if (!g0) fail(orbit_status::kMalformed, name, angleLine.offset + static_cast<int64_t>(kAngleColumn), "GREENWICH ANGLE", "bad number");
  data.greenwich_angle = *g0;

  const std::size_t body = lines.size() - kHeader.size();
  if (body % 3 != 0)
    fail(orbit_status::kFileIo, name, lines.back().offset, "record", "file ends inside a record");
  if (body == 0) fail(orbit_status::kMalformed, name, -1, "record", "no records");

  struct Raw {
    double time;
    Vec3 p, v;
  };
  std::vector<Raw> raw;
  raw.reserve(body / 3);
  for (std::size_t i = kHeader.size(); i < lines.size(); i += 3) {
    const Line& t = lines[i];
    // yyyy_ddd_hh_mm_ss_mmm, one separator between the fields
    const auto year = digits(t.text, 0, 4), day = digits(t.text, 5, 3), hh = digits(t.text, 9, 2),
               mm = digits(t.text, 12, 2), ss = digits(t.text, 15, 2), ms = digits(t.text, 18, 3);
    if (!year || !day || !hh || !mm || !ss || !ms || *day < 1 || *day > 366 || *year < 1985)
      fail(orbit_status::kMalformed, name, t.offset, "record time", "bad record time");
    char text[40];
    std::snprintf(text, sizeof text, "01-JAN-%04d 00:00:00.000000", *year);
    Raw r{};
    r.time = base::ascii2sec85(text) + (*day - 1) * 86400.0 + *hh * 3600.0 + *mm * 60.0 + *ss + *ms * 0.001;
    const auto p = scan_triplet(lines[i + 1].text);
    if (!p) fail(orbit_status::kMalformed, name, lines[i + 1].offset, "record position", "bad number");
    const auto v = scan_triplet(lines[i + 2].text);
    if (!v) fail(orbit_status::kMalformed, name, lines[i + 2].offset, "record velocity", "bad number");
    r.p = *p;
    r.v = *v;
    raw.push_back(r);
  }

  data.vectors.resize(raw.size());
  for (std::size_t i = 0; i < raw.size(); ++i)
    data.vectors[i] = inertial_to_earth_fixed(raw[i].time, raw[i].time - raw[0].time, data.greenwich_angle, raw[i].p,
                                              raw[i].v);
  check_increasing(data, name, -1, 0);
  data.sensing_start = data.vectors.front().time;
  data.sensing_stop = data.vectors.back().time;
  for (std::size_t i = 1; i < data.vectors.size(); ++i)
    data.widest_spacing = std::max(data.widest_spacing, data.vectors[i].time - data.vectors[i - 1].time);
  // Any number of records is taken; the degree 4 fit over five of them stays accurate only for
  // close records, so a wider spacing is read but reported.
  if (data.widest_spacing > kTextOrbitMaxSpacing) {
    char text[160];
    std::snprintf(text, sizeof text, "%s: orbit records %.1f s apart, wider than %.0f s: positions may be inaccurate",
                  name.c_str(), data.widest_spacing, kTextOrbitMaxSpacing);
    base::report(base::kReportWarning, text);
  }
  return data;
}

StateVector inertial_to_earth_fixed(double time, double elapsed, double g0, const Vec3& position,
                                    const Vec3& velocity) {
  constexpr double kSiderealRatio = 1.00273790934;
  constexpr double kSolarRate = 7.27220521664304e-05;
  constexpr double kVelocityRate = 7.2921158553e-05;
  const double theta = elapsed * kSiderealRatio * kSolarRate + g0;
  const double c = std::cos(theta), s = std::sin(theta);
  StateVector sv;
  sv.time = time;
  sv.position = {position[0] * c + position[1] * s, position[1] * c - position[0] * s, position[2]};
  const double a = velocity[0] + position[1] * kVelocityRate;
  const double b = velocity[1] - position[0] * kVelocityRate;
  sv.velocity = {a * c + b * s, b * c - a * s, velocity[2]};
  return sv;
}

OrbitData read_text_orbit(const std::filesystem::path& path) {
  return parse_text_orbit(read_whole_file(path), path.string());
}

OrbitData read_orbit(const std::filesystem::path& path) {
  const std::string bytes = read_whole_file(path);
  if (bytes.rfind("PRODUCT=", 0) == 0) return parse_envisat_orbit(bytes, path.string());
  for (const Line& l : split_lines(bytes)) {
    if (l.text.empty() || l.text[0] == ';' || blank(l.text)) continue;
    if (l.text[0] == 'G') return parse_text_orbit(bytes, path.string());
    break;
  }
  fail(orbit_status::kNotOrbitProduct, path.string(), 0, "PRODUCT", "not an orbit product");
}

}  // namespace sar::geometry

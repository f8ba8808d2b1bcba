#include "radarsat/ceos_leader.hpp"

#include <charconv>
#include <cmath>
#include <cstdio>
#include <fstream>
#include <numbers>
#include <optional>

#include "base/convert.hpp"

namespace sar::radarsat {

CeosError::CeosError(std::string file, int64_t offset, const std::string& what)
    : std::runtime_error(what), file_(std::move(file)), offset_(offset) {}

void ceos_fail(const std::string& file, int64_t offset, const std::string& text) {
  std::string what = file + ": " + text;
  if (offset >= 0) what += " at byte " + std::to_string(offset);
  throw CeosError(file, offset, what);
}

namespace {

// Leaders are tens of kilobytes; anything far larger is not a leader.
constexpr std::uintmax_t kMaxLeaderBytes = 64u << 20;
constexpr std::size_t kRecordHeader = 12;

uint32_t be32(std::string_view b, std::size_t at) {
  return (static_cast<uint32_t>(static_cast<uint8_t>(b[at])) << 24) |
         (static_cast<uint32_t>(static_cast<uint8_t>(b[at + 1])) << 16) |
         (static_cast<uint32_t>(static_cast<uint8_t>(b[at + 2])) << 8) | static_cast<uint32_t>(static_cast<uint8_t>(b[at + 3]));
}

std::string_view trim(std::string_view s) {
  while (!s.empty() && (s.front() == ' ')) s.remove_prefix(1);
  while (!s.empty() && (s.back() == ' ' || s.back() == '\0')) s.remove_suffix(1);
  return s;
}

std::optional<double> number(std::string_view s) {
  s = trim(s);
  if (s.empty()) return std::nullopt;
  if (s.front() == '+') s.remove_prefix(1);
  double v = 0.0;
  const auto [end, ec] = std::from_chars(s.data(), s.data() + s.size(), v);
  if (ec != std::errc() || end != s.data() + s.size() || !std::isfinite(v)) return std::nullopt;
  return v;
}

std::optional<int> integer(std::string_view s) {
  s = trim(s);
  if (s.empty()) return std::nullopt;
  int v = 0;
  const auto [end, ec] = std::from_chars(s.data(), s.data() + s.size(), v);
  if (ec != std::errc() || end != s.data() + s.size()) return std::nullopt;
  return v;
}

/// A record that must hold `size` bytes from `at` (relative to its start).
void need(const CeosRecord& r, std::size_t at, std::size_t size, const std::string& name, const char* what) {
  if (at + size > r.length)
    ceos_fail(name, r.offset, std::string(what) + " record of " + std::to_string(r.length) + " bytes is too short");
}

double real_field(std::string_view b, const CeosRecord& r, std::size_t at, std::size_t size, const std::string& name,
                  const char* field) {
  const auto v = number(b.substr(r.offset + at, size));
  if (!v) ceos_fail(name, r.offset + static_cast<int64_t>(at), std::string("bad number in ") + field);
  return *v;
}

int int_field(std::string_view b, const CeosRecord& r, std::size_t at, std::size_t size, const std::string& name,
              const char* field) {
  const auto v = integer(b.substr(r.offset + at, size));
  if (!v) ceos_fail(name, r.offset + static_cast<int64_t>(at), std::string("bad integer in ") + field);
  return *v;
}

const CeosRecord* find_record(const std::vector<CeosRecord>& records, uint8_t code) {
  for (const CeosRecord& r : records)
    if (r.type_code() == code && r.type[0] != 0x3F) return &r;
  return nullptr;
}

// Platform position record layout: count, date, time, interval, frame, GHA, then the vectors.
constexpr std::size_t kPprCount = 140, kPprYear = 144, kPprMonth = 148, kPprDay = 152, kPprDoy = 156;
constexpr std::size_t kPprSeconds = 160, kPprInterval = 182, kPprFrame = 204, kPprGha = 268, kPprVectors = 386;
constexpr std::size_t kReal = 22, kVectorBytes = 6 * kReal;

}  // namespace

std::string field_text(std::string_view bytes, std::size_t at, std::size_t size) {
  if (at >= bytes.size()) return {};
  return std::string(trim(bytes.substr(at, size)));
}

std::vector<CeosRecord> walk_records(std::string_view bytes, const std::string& name) {
  std::vector<CeosRecord> records;
  std::size_t at = 0;
  while (at < bytes.size()) {
    if (bytes.size() - at < kRecordHeader)
      ceos_fail(name, static_cast<int64_t>(at), "file ends inside a record header");
    CeosRecord r;
    r.offset = static_cast<int64_t>(at);
    r.sequence = be32(bytes, at);
    for (int i = 0; i < 4; ++i) r.type[i] = static_cast<uint8_t>(bytes[at + 4 + i]);
    r.length = be32(bytes, at + 8);
    if (r.length < kRecordHeader) ceos_fail(name, r.offset, "record length " + std::to_string(r.length) + " below 12");
    if (r.length > bytes.size() - at)
      ceos_fail(name, r.offset, "record of " + std::to_string(r.length) + " bytes runs past the end of the file (truncated?)");
    records.push_back(r);
    at += r.length;
  }
  return records;
}

double PlatformPosition::day_start() const {
  char text[40];
  std::snprintf(text, sizeof text, "01-JAN-%04d 00:00:00.000000", year);
  return base::ascii2sec85(text) + (day_of_year - 1) * 86400.0;
}

bool PlatformPosition::inertial() const { return frame.find("INERTIAL") != std::string::npos; }

Leader parse_leader(std::string_view bytes, const std::string& name) {
  if (bytes.size() < 19 || bytes.substr(16, 3) != "CEO") ceos_fail(name, 16, "not a CEOS file (no \"CEO\" at byte 16)");
  Leader leader;
  leader.path = name;
  leader.records = walk_records(bytes, name);

  const CeosRecord* dss = find_record(leader.records, record_code::kDataSetSummary);
  if (!dss) ceos_fail(name, -1, "no data set summary record (type 10) in the leader");
  need(*dss, 1110, 16, name, "data set summary");
  DataSetSummary& d = leader.dss;
  d.offset = dss->offset;
  d.scene_id = field_text(bytes, dss->offset + 20, 16);
  d.orbit_configuration = field_text(bytes, dss->offset + 100, 16);
  d.mission = field_text(bytes, dss->offset + 396, 16);
  d.sensor = field_text(bytes, dss->offset + 412, 32);
  d.orbit_number = field_text(bytes, dss->offset + 444, 8);
  d.product_type = field_text(bytes, dss->offset + 1110, 16);
  const bool radarsat = d.mission == "R1" || d.mission.rfind("RSAT-1", 0) == 0 || d.sensor.rfind("RSAT-1", 0) == 0;
  if (!radarsat)
    ceos_fail(name, dss->offset + 396,
              "leader of another satellite (mission \"" + d.mission + "\", sensor \"" + d.sensor + "\"), not RADARSAT-1");

  const CeosRecord* ppr = find_record(leader.records, record_code::kPlatformPosition);
  if (!ppr) ceos_fail(name, -1, "no platform position record (type 30) in the leader");
  need(*ppr, kPprVectors, 0, name, "platform position");
  PlatformPosition& p = leader.ppr;
  p.offset = ppr->offset;
  p.count = int_field(bytes, *ppr, kPprCount, 4, name, "vector count");
  p.year = int_field(bytes, *ppr, kPprYear, 4, name, "year");
  p.month = int_field(bytes, *ppr, kPprMonth, 4, name, "month");
  p.day = int_field(bytes, *ppr, kPprDay, 4, name, "day");
  p.day_of_year = int_field(bytes, *ppr, kPprDoy, 4, name, "day of year");
  if (p.year < 1985 || p.year > 2100 || p.day_of_year < 1 || p.day_of_year > 366)
    ceos_fail(name, ppr->offset + static_cast<int64_t>(kPprYear), "platform position date out of range");
  p.seconds_of_day = real_field(bytes, *ppr, kPprSeconds, kReal, name, "time of the first vector");
  p.interval = real_field(bytes, *ppr, kPprInterval, kReal, name, "vector interval");
  p.frame = field_text(bytes, ppr->offset + kPprFrame, 64);
  p.gha_deg = real_field(bytes, *ppr, kPprGha, kReal, name, "Greenwich hour angle");
  if (p.count < 0) ceos_fail(name, ppr->offset + static_cast<int64_t>(kPprCount), "negative vector count");
  need(*ppr, kPprVectors, static_cast<std::size_t>(p.count) * kVectorBytes, name, "platform position");
  for (int k = 0; k < p.count; ++k) {
    const std::size_t at = kPprVectors + static_cast<std::size_t>(k) * kVectorBytes;
    geometry::Vec3 pos{}, vel{};
    for (int i = 0; i < 3; ++i) {
      pos[i] = real_field(bytes, *ppr, at + i * kReal, kReal, name, "vector position");
      vel[i] = real_field(bytes, *ppr, at + (3 + i) * kReal, kReal, name, "vector velocity");
    }
    p.positions.push_back(pos);
    p.velocities.push_back(vel);
  }
  return leader;
}

Leader read_leader(const std::filesystem::path& path) {
  const std::string name = path.string();
  std::error_code ec;
  const std::uintmax_t size = std::filesystem::file_size(path, ec);
  if (ec) ceos_fail(name, -1, "leader file not found");
  if (size > kMaxLeaderBytes) ceos_fail(name, -1, "leader file too large");
  std::ifstream in(path, std::ios::binary);
  if (!in) ceos_fail(name, -1, "leader file cannot be opened");
  std::string bytes(static_cast<std::size_t>(size), '\0');
  in.read(bytes.data(), static_cast<std::streamsize>(size));
  if (static_cast<std::uintmax_t>(in.gcount()) != size) ceos_fail(name, -1, "leader file cannot be read");
  return parse_leader(bytes, name);
}

geometry::OrbitData leader_orbit(const Leader& leader) {
  using geometry::operator*;
  const PlatformPosition& p = leader.ppr;
  // The figure in the text is the system's long-standing message; the test is for five.
  if (p.count < kMinLeaderVectors)
    ceos_fail(leader.path, p.offset, "There are less than 3 state vectors in the leader file! (" +
                                         std::to_string(p.count) + " vectors)");
  if (!(p.interval > 0.0)) ceos_fail(leader.path, p.offset + static_cast<int64_t>(kPprInterval), "vector interval not positive");
  geometry::OrbitData orbit;
  orbit.family = geometry::OrbitFamily::kTextOrbit;  // five-record degree 4 fit, as the text orbit
  orbit.path = leader.path;
  orbit.product_name = "CEOS_LEADER";
  orbit.greenwich_angle = p.gha_deg * std::numbers::pi / 180.0;
  const double t0 = p.first_time();
  for (int k = 0; k < p.count; ++k) {
    geometry::Vec3 pos = p.positions[k], vel = p.velocities[k];
    // Orbit radii are about 7e6 m, speeds about 7.5e3 m/s: the magnitude tells the unit.
    if (geometry::norm(pos) < 1.0e5) pos = 1000.0 * pos;
    if (geometry::norm(vel) > 1.0e5) vel = 0.001 * vel;
    const double elapsed = k * p.interval;
    geometry::StateVector sv;
    if (p.inertial()) {
      sv = geometry::inertial_to_earth_fixed(t0 + elapsed, elapsed, orbit.greenwich_angle, pos, vel);
    } else {
      sv.time = t0 + elapsed;
      sv.position = pos;
      sv.velocity = vel;
    }
    orbit.vectors.push_back(sv);
  }
  orbit.sensing_start = orbit.vectors.front().time;
  orbit.sensing_stop = orbit.vectors.back().time;
  orbit.widest_spacing = p.interval;
  return orbit;
}

}  // namespace sar::radarsat

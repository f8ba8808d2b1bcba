// Orbit readers: the real DORIS products, the text orbit, and what broken files give.
#include <gtest/gtest.h>

#include <fstream>
#include <random>
#include <sstream>
#include <unistd.h>

#include "geometry/orbit_file.hpp"
#include "geometry/orbit_interp.hpp"
#include "synthetic_orbit.hpp"

namespace sar::geometry {
namespace {

using testing::kPor;
using testing::kVor;
using testing::real_file;

std::string slurp(const std::string& path) {
  std::ifstream in(path, std::ios::binary);
  std::ostringstream s;
  s << in.rdbuf();
  return s.str();
}

TEST(OrbitFile, RealDorisProductsReadWhole) {
  struct Case {
    const char* file;
    const char* type;
  };
  for (const Case& c : {Case{kVor, "DOR_VOR_AX"}, Case{kPor, "DOR_POR_AX"}}) {
    SCOPED_TRACE(c.file);
    const OrbitData d = read_orbit(real_file(c.file));
    EXPECT_EQ(d.family, OrbitFamily::kEnvisat);
    EXPECT_EQ(d.product_name, c.type);
    ASSERT_EQ(d.vectors.size(), 1589u);
    EXPECT_DOUBLE_EQ(d.vectors.front().time, d.sensing_start);
    EXPECT_DOUBLE_EQ(d.vectors.back().time, d.sensing_stop);
    for (std::size_t k = 1; k < d.vectors.size(); ++k) ASSERT_DOUBLE_EQ(d.vectors[k].time - d.vectors[k - 1].time, 60.0);
    // Every record is a LEO state: 7.1 to 7.2 thousand km from the centre, 7.4 to 7.6 km/s relative to the Earth.
    for (const StateVector& sv : d.vectors) {
      ASSERT_GT(norm(sv.position), 7.1e6);
      ASSERT_LT(norm(sv.position), 7.2e6);
      ASSERT_GT(norm(sv.velocity), 7.4e3);
      ASSERT_LT(norm(sv.velocity), 7.6e3);
    }
  }
  const OrbitData vor = read_orbit(real_file(kVor));
  // First record: 01-MAR-2008 21:55:27, orbit 31388, "+6494931.106 +0578715.148 -2977719.455 +3188.730641 ..."
  EXPECT_EQ(vor.vectors[0].orbit_number, 31388);
  EXPECT_DOUBLE_EQ(vor.vectors[0].position[0], 6494931.106);
  EXPECT_DOUBLE_EQ(vor.vectors[0].position[2], -2977719.455);
  EXPECT_DOUBLE_EQ(vor.vectors[0].velocity[0], 3188.730641);
  EXPECT_DOUBLE_EQ(vor.vectors[1588].velocity[2], -1520.099084);
  EXPECT_EQ(vor.vectors[1588].orbit_number, 31404);
  // 1-MAR-2008 21:55:27 in sec85: 8460 days after 1985 plus the time of day.
  EXPECT_DOUBLE_EQ(vor.sensing_start, 8460.0 * 86400.0 + 21 * 3600 + 55 * 60 + 27);
}

// One mutation of the real VOR bytes per row, with the status it must end in.
struct Fault {
  const char* name;
  void (*mutate)(std::string&);
  int status;
};

void put(std::string& b, std::size_t at, const char* text) { b.replace(at, std::char_traits<char>::length(text), text); }
constexpr std::size_t kSph = 1247, kData = 1625, kRec = 129;

const Fault kFaults[] = {
    {"empty file", [](std::string& b) { b.clear(); }, orbit_status::kNotOrbitProduct},
    {"wrong product type", [](std::string& b) { put(b, 9, "ASA_XCA_AX"); }, orbit_status::kNotOrbitProduct},
    {"truncated inside the headers", [](std::string& b) { b.resize(1000); }, orbit_status::kFileIo},
    {"truncated inside the records", [](std::string& b) { b.resize(b.size() - 100); }, orbit_status::kFileIo},
    {"record count larger than the file", [](std::string& b) { put(b, kSph + 305, "+0001590"); }, orbit_status::kFileIo},
    {"record count beyond 32 bits", [](std::string& b) { put(b, kSph + 305, "+9999999999"); }, orbit_status::kMalformed},
    {"negative record count", [](std::string& b) { put(b, kSph + 305, "-0000001589"); }, orbit_status::kMalformed},
    {"data offset past the end", [](std::string& b) { put(b, kSph + 231, "+00000000000001000000"); }, orbit_status::kFileIo},
    {"data offset of 20 nines", [](std::string& b) { put(b, kSph + 231, "+99999999999999999999"); }, orbit_status::kMalformed},
    {"data offset not a number", [](std::string& b) { put(b, kSph + 231, "+x"); }, orbit_status::kMalformed},
    {"garbage X position", [](std::string& b) { put(b, kData + 10 * kRec + 44, "+6494x31.106"); }, orbit_status::kMalformed},
    {"NaN velocity", [](std::string& b) { put(b, kData + 3 * kRec + 96, "+nan        "); }, orbit_status::kMalformed},
    {"garbage epoch", [](std::string& b) { put(b, kData + 5 * kRec, "01-XYZ-2008"); }, orbit_status::kMalformed},
    {"garbage sensing start", [](std::string& b) { put(b, 351, "xx"); }, orbit_status::kMalformed},
    {"epochs out of order", [](std::string& b) { put(b, kData + 7 * kRec, "01-MAR-2008 21:55:27"); }, orbit_status::kMalformed},
};

TEST(OrbitFile, FaultTable) {
  const std::string real = slurp(real_file(kVor));
  ASSERT_EQ(real.size(), 206606u);
  for (const Fault& f : kFaults) {
    SCOPED_TRACE(f.name);
    std::string bytes = real;
    f.mutate(bytes);
    try {
      parse_envisat_orbit(bytes, "mutated");
      ADD_FAILURE() << "accepted";
    } catch (const OrbitError& e) {
      EXPECT_EQ(e.status(), f.status) << e.what();
      EXPECT_EQ(e.file(), "mutated");
    }
  }
}

TEST(OrbitFile, RandomByteDamageNeverCrashes) {
  // Hostile headers and records: every outcome is a table or an OrbitError, never a crash.
  const std::string real = slurp(real_file(kVor));
  std::mt19937 rng(7);
  std::uniform_int_distribution<std::size_t> where(0, kData + 20 * kRec);
  std::uniform_int_distribution<int> byte(0, 255);
  int accepted = 0;
  for (int trial = 0; trial < 300; ++trial) {
    std::string bytes = real;
    for (int k = 0; k < 4; ++k) bytes[where(rng)] = static_cast<char>(byte(rng));
    if (trial % 3 == 0) bytes.resize(where(rng));
    try {
      const OrbitData d = parse_envisat_orbit(bytes, "damaged");
      ++accepted;
      for (std::size_t k = 1; k < d.vectors.size(); ++k) ASSERT_GT(d.vectors[k].time, d.vectors[k - 1].time);
    } catch (const OrbitError&) {
    }
  }
  EXPECT_GT(accepted, 0);  // damage to unused header bytes is harmless
}

// ---------------------------------------------------------------------------------------------
// Text orbit

/// A text orbit of `count` records `step` s apart; inertial coordinates of the circular orbit.
std::string make_text_orbit(const testing::CircularOrbit& orbit, double g0, int count, double step,
                            const std::string& drop = "") {
  std::ostringstream s;
  s << "; generated for the tests\n";
  if (drop != "G1") s << "GENERATION TIME: 2008-061 00:00:00\n";
  if (drop != "O") s << "ORBIT NUMBER: 31388\n";
  s << "; a comment between header lines\n";
  if (drop != "G2") {
    char line[80];
    std::snprintf(line, sizeof line, "GREENWICH ANGLE: %.12f\n", g0);
    s << line;
  }
  if (drop != "1") s << "1ST MODEL: none\n";
  if (drop != "2") s << "2ND MODEL: none\n";
  // The records start on day 100 of 2008 at 10:00:00.000 UTC.
  for (int k = 0; k < count; ++k) {
    const double sec = 36000.0 + k * step;
    const int hh = static_cast<int>(sec / 3600), mm = static_cast<int>(sec / 60) % 60, ss = static_cast<int>(sec) % 60;
    const int ms = static_cast<int>(std::lround((sec - std::floor(sec)) * 1000));
    Vec3 p, v;
    orbit.inertial(orbit.t_ref + k * step, p, v);
    char line[200];
    std::snprintf(line, sizeof line, "2008 100 %02d %02d %02d %03d\n%.4f %.4f %.4f\n%.7f %.7f %.7f\n", hh, mm, ss, ms,
                  p[0], p[1], p[2], v[0], v[1], v[2]);
    s << line << "; behind a record\n";
  }
  return s.str();
}

TEST(TextOrbit, ReadsRecordsEarthFixed) {
  testing::CircularOrbit orbit;
  const double g0 = 1.25;
  const OrbitData d = parse_text_orbit(make_text_orbit(orbit, g0, 20, 60.0), "text");
  EXPECT_EQ(d.family, OrbitFamily::kTextOrbit);
  ASSERT_EQ(d.vectors.size(), 20u);  // sized by the file, not 15
  EXPECT_DOUBLE_EQ(d.greenwich_angle, g0);
  // 2008 day 100 10:00:00: 23 years and 5 leap days after 1985, plus 99 days.
  EXPECT_DOUBLE_EQ(d.vectors[0].time, (23 * 365 + 5 + 99) * 86400.0 + 36000.0);
  for (std::size_t k = 0; k < d.vectors.size(); ++k) {
    // Earth-fixed = inertial turned by the sidereal angle; the radius and |z| survive.
    Vec3 p, v;
    orbit.inertial(orbit.t_ref + 60.0 * static_cast<double>(k), p, v);
    const double th = 60.0 * static_cast<double>(k) * 1.00273790934 * 7.27220521664304e-05 + g0;
    EXPECT_NEAR(d.vectors[k].position[0], p[0] * std::cos(th) + p[1] * std::sin(th), 1e-3);
    EXPECT_NEAR(d.vectors[k].position[1], p[1] * std::cos(th) - p[0] * std::sin(th), 1e-3);
    EXPECT_NEAR(d.vectors[k].position[2], p[2], 1e-3);
  }
}

TEST(TextOrbit, AnySpacingIsReadAndTheWidestIsKnown) {
  testing::CircularOrbit orbit;
  for (const double step : {30.0, 60.0, 90.0}) {
    const OrbitData d = parse_text_orbit(make_text_orbit(orbit, 0.3, 7, step), "text");
    ASSERT_EQ(d.vectors.size(), 7u);
    EXPECT_DOUBLE_EQ(d.widest_spacing, step);
    // Inside the records only: one millisecond past the last is refused.
    EXPECT_NO_THROW(orbit_state_at(d, d.vectors.back().time));
    try {
      orbit_state_at(d, d.vectors.back().time + 1e-3);
      ADD_FAILURE() << "time past the records accepted";
    } catch (const OrbitError& e) {
      EXPECT_EQ(e.status(), orbit_status::kOutsideSpan);
    }
  }
}

TEST(TextOrbit, FaultTable) {
  testing::CircularOrbit orbit;
  struct Case {
    const char* name;
    std::string text;
    int status;
    const char* message;
  };
  const std::string good = make_text_orbit(orbit, 0.5, 15, 60.0);
  std::string truncated = good.substr(0, good.rfind("\n", good.size() - 30));  // ends inside the last record
  std::string garbage = good;
  garbage.replace(garbage.find("2008 100 10 01 00 000\n") + 22, 3, "x.y");
  std::string backwards = good;
  backwards.replace(backwards.find("2008 100 10 03"), 14, "2008 100 09 03");
  const Case cases[] = {
      {"no generation line", make_text_orbit(orbit, 0.5, 15, 60.0, "G1"), orbit_status::kNoNodeOrHeader,
       "GENERATION TIME not found in the Orbit file"},
      {"no orbit number", make_text_orbit(orbit, 0.5, 15, 60.0, "O"), orbit_status::kNoNodeOrHeader,
       "ORBIT NUMBER not found in the Orbit file"},
      {"no Greenwich angle", make_text_orbit(orbit, 0.5, 15, 60.0, "G2"), orbit_status::kNoNodeOrHeader,
       "GREENWICH ANGLE not found in the Orbit file"},
      {"no first model", make_text_orbit(orbit, 0.5, 15, 60.0, "1"), orbit_status::kNoNodeOrHeader,
       "FIRST MODEL not found in the Orbit file"},
      // A record year 2xxx passes the second model's first-character test; the count of
      // lines behind it then leaves a record incomplete.
      {"no second model, 21st century records", make_text_orbit(orbit, 0.5, 15, 60.0, "2"), orbit_status::kFileIo,
       nullptr},
      {"ends inside a record", truncated, orbit_status::kFileIo, nullptr},
      {"garbage position", garbage, orbit_status::kMalformed, nullptr},
      {"epochs out of order", backwards, orbit_status::kMalformed, nullptr},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    try {
      parse_text_orbit(c.text, "text");
      ADD_FAILURE() << "accepted";
    } catch (const OrbitError& e) {
      EXPECT_EQ(e.status(), c.status) << e.what();
      if (c.message) {
        EXPECT_STREQ(e.what(), c.message);
      }
    }
  }
}

TEST(OrbitFile, DispatchByContent) {
  const auto dir = std::filesystem::temp_directory_path() / ("sar_geometry_test_" + std::to_string(::getpid()));
  std::filesystem::create_directories(dir);
  const auto text = dir / "orbit.txt";
  std::ofstream(text) << make_text_orbit(testing::CircularOrbit{}, 0.1, 15, 60.0);
  EXPECT_EQ(read_orbit(text).family, OrbitFamily::kTextOrbit);
  const auto other = dir / "other";
  std::ofstream(other) << "hello\n";
  try {
    read_orbit(other);
    ADD_FAILURE();
  } catch (const OrbitError& e) {
    EXPECT_EQ(e.status(), orbit_status::kNotOrbitProduct);
  }
  try {
    read_orbit(dir / "missing");
    ADD_FAILURE();
  } catch (const OrbitError& e) {
    EXPECT_EQ(e.status(), orbit_status::kFileIo);
  }
  std::filesystem::remove_all(dir);
}

}  // namespace
}  // namespace sar::geometry

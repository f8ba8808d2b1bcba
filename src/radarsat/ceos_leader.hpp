#pragma once
// RADARSAT-1 CEOS leader files (`lea_01.001`): the record walk, the data set summary and the
// platform position record with its state vectors.
//
// Records are found by walking the file by their 12-byte headers (sequence number, four type
// bytes, record length), never at fixed offsets: leaders of different stations and processors
// place their records differently. Leaders are untrusted input: every length is checked against
// the file before it is used, and a broken file ends in a CeosError naming it.
#include <array>
#include <cstdint>
#include <filesystem>
#include <stdexcept>
#include <string>
#include <string_view>
#include <vector>

#include "geometry/orbit_file.hpp"
#include "geometry/vec3.hpp"

namespace sar::radarsat {

/// Failure of a CEOS read: status 1 (the extraction's refusal), the file and a text naming it.
class CeosError : public std::runtime_error {
 public:
  CeosError(std::string file, int64_t offset, const std::string& what);
  const std::string& file() const { return file_; }
  int64_t offset() const { return offset_; }
  int status() const { return 1; }

 private:
  std::string file_;
  int64_t offset_;
};

/// Throws CeosError with "<file>: <text> at byte <offset>" (no byte part for offset < 0).
[[noreturn]] void ceos_fail(const std::string& file, int64_t offset, const std::string& text);

/// Record type code (second type byte) of the records this system reads.
namespace record_code {
constexpr uint8_t kFileDescriptor = 0xC0;  ///< 3F C0 12 12 in a leader
constexpr uint8_t kDataSetSummary = 10;    ///< 0A 0A 12 14
constexpr uint8_t kPlatformPosition = 30;  ///< 0A 1E 12 14
}  // namespace record_code

struct CeosRecord {
  int64_t offset = 0;
  uint32_t sequence = 0;
  std::array<uint8_t, 4> type{};
  uint32_t length = 0;
  uint8_t type_code() const { return type[1]; }
};

/// Walk the records of a CEOS file from its start. A length below 12 or running past the end
/// is refused; trailing bytes too short for a header are refused too.
std::vector<CeosRecord> walk_records(std::string_view bytes, const std::string& name);

/// The values of the data set summary the system uses (texts as stored, trailing blanks cut).
struct DataSetSummary {
  int64_t offset = 0;
  std::string scene_id;            ///< DSS + 20
  std::string orbit_configuration; ///< DSS + 100, "ASCENDING" or "DESCENDING"
  std::string mission;             ///< DSS + 396
  std::string sensor;              ///< DSS + 412
  std::string orbit_number;        ///< DSS + 444, 8 characters
  std::string product_type;        ///< DSS + 1110, 16 characters
};

/// The platform position record: the vectors as stored plus what turns them Earth-fixed.
struct PlatformPosition {
  int64_t offset = 0;
  int count = 0;
  int year = 0, month = 0, day = 0, day_of_year = 0;
  double seconds_of_day = 0.0;  ///< first vector
  double interval = 0.0;        ///< s between vectors
  std::string frame;            ///< reference frame text
  double gha_deg = 0.0;         ///< Greenwich hour angle at the first vector, degrees
  std::vector<geometry::Vec3> positions;   ///< as stored (km or m)
  std::vector<geometry::Vec3> velocities;  ///< as stored (m/s or mm/s)

  /// sec85 of 00:00 UTC of the vectors' day.
  double day_start() const;
  /// sec85 of the first vector.
  double first_time() const { return day_start() + seconds_of_day; }
  bool inertial() const;
};

struct Leader {
  std::string path;
  std::vector<CeosRecord> records;
  DataSetSummary dss;
  PlatformPosition ppr;
  /// Product type says the data set is already focused.
  bool is_slc() const { return dss.product_type == "RSAT-1-SAR-SLC"; }
};

/// Read and check a leader: "CEO" at byte 16, a RADARSAT-1 mission, a data set summary and a
/// platform position record. The vector count is not checked here (see leader_orbit).
Leader read_leader(const std::filesystem::path& path);
Leader parse_leader(std::string_view bytes, const std::string& name);

/// Fewest leader vectors that give an orbit.
inline constexpr int kMinLeaderVectors = 5;

/// The leader's vectors as an Earth-fixed orbit in metres: inertial frames are turned with the
/// GHA at the first vector and the sidereal rate; km and mm/s are told from m and m/s by
/// magnitude. Fewer than five vectors: CeosError "There are less than 3 state vectors in the
/// leader file!".
geometry::OrbitData leader_orbit(const Leader& leader);

/// Text of a fixed-width field with trailing blanks and NULs cut.
std::string field_text(std::string_view bytes, std::size_t at, std::size_t size);

}  // namespace sar::radarsat

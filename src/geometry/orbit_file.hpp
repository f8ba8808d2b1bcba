#pragma once
// Orbit products: ENVISAT-format state vector files (DOR_VOR_AX, DOR_POR_AX, AUX_FRO_AX,
// AUX_FPO_AX) and the plain RADARSAT orbit text, read into one table of Earth-fixed state
// vectors.
//
// Files are untrusted: every size and count read from a header is checked against the file
// size in 64-bit arithmetic, numbers are parsed without the C locale, and a broken file ends
// in an OrbitError that names the file, the byte offset and the field.
#include <cstdint>
#include <filesystem>
#include <stdexcept>
#include <string>
#include <vector>

#include "base/errors.hpp"
#include "geometry/vec3.hpp"

namespace sar::geometry {

/// Status codes of the orbit layer, as returned by the status-style entry points.
namespace orbit_status {
constexpr int kOk = 0;
/// Ascending node asked for but no crossing before t; or a missing header line of the text orbit.
constexpr int kNoNodeOrHeader = 1;
/// The file is not one of the orbit products.
constexpr int kNotOrbitProduct = 12;
/// The wanted time lies outside the file's sensing interval or outside its records.
constexpr int kOutsideSpan = 13;
/// The file is missing, unreadable or shorter than its header says (truncated).
constexpr int kFileIo = 20;
/// A field that should hold a number or a time holds something else, or epochs do not increase.
constexpr int kMalformed = 21;
}  // namespace orbit_status

/// Failure of an orbit read or query: the input error with the orbit layer's status code.
class OrbitError : public base::InputError {
 public:
  OrbitError(int status, std::string file, int64_t offset, std::string field, const std::string& what);
  int status() const { return status_; }

 private:
  int status_;
};

enum class OrbitFamily {
  kEnvisat,   ///< 129-byte records behind MPH and SPH: nine-point Lagrange on positions and velocities
  kTextOrbit  ///< RADARSAT text orbit: degree 4 fit through five records, velocity its derivative
};

/// One epoch of the orbit.
struct StateVector {
  double time = 0.0;        ///< sec85 (s since 1-JAN-1985 UTC)
  int orbit_number = 0;     ///< absolute orbit (0 for the text orbit)
  Vec3 position{};          ///< Earth-fixed, m
  Vec3 velocity{};          ///< Earth-fixed, m/s
};

/// A whole orbit file in memory.
struct OrbitData {
  OrbitFamily family = OrbitFamily::kEnvisat;
  std::string path;
  std::string product_name;       ///< the 10-character product type, or "TEXT_ORBIT"
  double sensing_start = 0.0;     ///< sec85, first valid time
  double sensing_stop = 0.0;      ///< sec85, last valid time
  double greenwich_angle = 0.0;   ///< rad at the first record (text orbit only)
  double widest_spacing = 0.0;    ///< s, largest gap between two records
  std::vector<StateVector> vectors;  ///< strictly increasing epochs
};

/// An inertial state vector turned Earth-fixed: the Greenwich sidereal angle is g0 (rad) at the
/// reference epoch and grows at the sidereal rate over `elapsed` seconds from it. The velocity
/// loses the frame's rotation (v - w x p) before the turn. `time` is copied into the result.
StateVector inertial_to_earth_fixed(double time, double elapsed, double g0, const Vec3& position,
                                    const Vec3& velocity);

/// Warning of the text orbit reader about record spacings wider than it interpolates well.
inline constexpr double kTextOrbitMaxSpacing = 60.0;

/// The four ENVISAT-format orbit product types.
bool is_orbit_product_name(std::string_view name10);

/// Read an ENVISAT-format orbit product. Throws OrbitError (kNotOrbitProduct for another
/// product type, kFileIo for a missing or truncated file, kMalformed for bad fields).
OrbitData read_envisat_orbit(const std::filesystem::path& path);

/// Read a RADARSAT text orbit; inertial records are turned Earth-fixed with the file's
/// Greenwich angle. Throws OrbitError (kNoNodeOrHeader with the header-line message for a
/// missing header line, kFileIo, kMalformed).
OrbitData read_text_orbit(const std::filesystem::path& path);

/// Read an orbit file of any family: ENVISAT format when the file opens with a main product
/// header, the text orbit when it opens with its generation line (comments allowed),
/// otherwise OrbitError kNotOrbitProduct.
OrbitData read_orbit(const std::filesystem::path& path);

/// The same readers over bytes already in memory; `name` labels errors.
OrbitData parse_envisat_orbit(std::string_view bytes, const std::string& name);
OrbitData parse_text_orbit(std::string_view bytes, const std::string& name);

}  // namespace sar::geometry

#pragma once
// A sun-synchronous ENVISAT-like orbit in Earth-fixed coordinates, and the WGS84 conversions
// the scene needs. The argument of latitude u runs uniformly and the node drifts uniformly; the
// radius follows the ellipsoid as a frozen orbit does,
//   r(u) = a - d sin^2(i) sin^2(u),   d = equatorial minus polar radius of WGS84,
// so that the geodetic altitude stays nearly constant and the radial velocity
//   dr/dt = -d sin^2(i) sin(2u) du/dt
// reaches about 22 m/s at mid latitudes. That radial motion is what the pitch term of ENVISAT's
// yaw-steering law answers: on a circular orbit the law would leave a centroid of some 750 Hz.
// The velocity is the exact time derivative of the position, so an orbit file sampled every
// 60 s interpolates back to the model far below a millimetre.
#include <cmath>
#include "base/constants.hpp"

namespace sar::simulator {

struct Vec3 {
  double x = 0.0, y = 0.0, z = 0.0;
  Vec3 operator+(const Vec3& o) const { return {x + o.x, y + o.y, z + o.z}; }
  Vec3 operator-(const Vec3& o) const { return {x - o.x, y - o.y, z - o.z}; }
  Vec3 operator*(double s) const { return {x * s, y * s, z * s}; }
  double dot(const Vec3& o) const { return x * o.x + y * o.y + z * o.z; }
  Vec3 cross(const Vec3& o) const { return {y * o.z - z * o.y, z * o.x - x * o.z, x * o.y - y * o.x}; }
  double norm() const { return std::sqrt(dot(*this)); }
  Vec3 unit() const { return *this * (1.0 / norm()); }
};

using base::kPi;
using base::kSpeedOfLight;
inline constexpr double kEarthRotation = 7.292115189334571e-05;  // rad/s
inline constexpr double kWgs84A = 6378137.0;
inline constexpr double kWgs84B = 6356752.314245;

struct Geodetic {
  double lat_deg = 0.0;
  double lon_deg = 0.0;
  double height = 0.0;
};

Vec3 geodetic_to_ecef(const Geodetic& g);
Geodetic ecef_to_geodetic(const Vec3& p);

struct StateVector {
  double time = 0.0;  // sec85
  Vec3 position;      // Earth-fixed, m
  Vec3 velocity;      // Earth-fixed, m/s
};

/// Orbit elements at an epoch. Defaults: ENVISAT, 501 orbits in 35 days (period 100.6 min),
/// inclination 98.55 deg, node drifting once a year (sun-synchronous).
struct OrbitElements {
  double epoch = 0.0;                                  // sec85
  double semi_major_axis = 7159.49e3;                  // m; radius over the equator, altitude about 781 km
  double radius_dip = kWgs84A - kWgs84B;  // m; radius drop from equator to pole over sin^2(i); 0: circular
  double inclination_deg = 98.55;
  double mean_motion = 2.0 * kPi * 501.0 / (35.0 * 86400.0);  // rad/s
  double node_rate = 2.0 * kPi / (365.2422 * 86400.0);        // inertial node drift, rad/s
  double arg_latitude = 0.0;   // argument of latitude at the epoch, rad, 0 <= u < 2 pi
  double node_longitude = 0.0; // Earth-fixed longitude of the ascending node at the epoch, rad
  int orbit_number = 1;        // absolute orbit in progress at the epoch
};

class OrbitModel {
 public:
  explicit OrbitModel(const OrbitElements& elements) : e_(elements) {}

  const OrbitElements& elements() const { return e_; }
  /// State at `dt` seconds after the epoch. Offsets keep full precision near the scene.
  StateVector state_at_offset(double dt) const;
  StateVector state(double sec85) const { return state_at_offset(sec85 - e_.epoch); }
  /// Orbit radius (m) at the argument of latitude u (rad).
  double radius(double u) const;
  /// Absolute orbit number at a time; it increases at each ascending node (Z from - to +).
  int absolute_orbit(double sec85) const;
  /// Time of the last ascending node not after `sec85`.
  double ascending_node_before(double sec85) const;
  double period() const { return 2.0 * kPi / e_.mean_motion; }

  /// An orbit that sees `target` at zero Doppler at `time`, to its right, under the incidence
  /// angle `incidence_deg` (on a sphere through the target), on a descending or ascending pass.
  static OrbitModel for_scene(const Geodetic& target, double time, double incidence_deg, bool ascending,
                              int orbit_number);

 private:
  OrbitElements e_;
};

/// Zero-Doppler time of a ground point, as an offset from the orbit epoch: the root of
/// (P - S(t)) . V(t), bracketed outward from `guess_offset` and refined by bisection to 1e-9 s.
/// Throws std::runtime_error if no root lies within a quarter orbit of the guess.
double zero_doppler_offset(const OrbitModel& orbit, const Vec3& point, double guess_offset);

}  // namespace sar::simulator

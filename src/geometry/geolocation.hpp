#pragma once
// Range-Doppler geolocation on the WGS84 ellipsoid.
//
// Forward: from the satellite state, a two-way slant time and a Doppler frequency to the
// point on the Earth (gr_pt0, gr_pt, gr_pt_lat_lon and its two state-vector forms).
// Backward: from a point on the Earth and an orbit to the time it is seen at a Doppler and
// its slant time (inv_grpt and variants). Positions are Earth-fixed metres; the look side is
// +1 for right-looking, -1 for left-looking; Doppler follows f = -(2 / wavelength) dR/dt.
#include <array>
#include <span>

#include "geometry/orbit_file.hpp"
#include "geometry/orbit_poly.hpp"
#include "geometry/vec3.hpp"

namespace sar::geometry {

inline constexpr double kHalfLightSpeed = 149896229.0;          ///< m per s of two-way time
inline constexpr double kTwoWayTimePerMetre = 6.671281903963041e-09;
inline constexpr double kEarthRotation = 7.292115189334571e-05;  ///< rad/s
inline constexpr double kWgs84A = 6378137.0;                     ///< m
inline constexpr double kWgs84B = 6356752.314245;                ///< m
inline constexpr double kGravityConstant = 398600470000000.0;    ///< m^3/s^2
inline constexpr double kDegreesPerRadian = 57.29577951308232;

/// Status of the forward solvers.
namespace geo_status {
constexpr int kOk = 0;
constexpr int kSingularPlanes = 1;  ///< gr_pt0: range and Doppler planes parallel
constexpr int kNoIntersection = 2;  ///< gr_pt0: the range sphere misses the Earth
constexpr int kOutOfFit = -1;       ///< gr_pt_lat_lon: time outside the five state vectors
constexpr int kCannotExtrapolate = 12;  ///< inv_grpt: the solution left the orbit fit
}  // namespace geo_status

/// One range-Doppler question for gr_pt0 / gr_pt.
struct RangeDopplerParams {
  double tau = 0.0;                  ///< two-way slant time, s
  double fdc = 0.0;                  ///< Doppler, Hz
  double wavelength = 0.05623564;    ///< m (ASAR C band)
  double omega = kEarthRotation;     ///< rad/s; 0 when V is already relative to the Earth
  double side = 1.0;                 ///< +1 right-looking, -1 left-looking
  double a = kWgs84A;                ///< semi-major axis of the target surface, m
  double b = kWgs84B;                ///< semi-minor axis, m
};

/// First estimate: the zero-Doppler point on a sphere of the local Earth radius. V is the
/// inertial satellite velocity when omega is the Earth rotation. Returns a geo_status code.
int gr_pt0(const Vec3& P, const Vec3& V, const RangeDopplerParams& params, Vec3& X);

/// Newton refinement on the ellipsoid (a, b), the Doppler and the range equations, at most
/// twenty steps; stops without error when the steps stop shrinking. Returns gr_pt0's status.
int gr_pt(const Vec3& P, const Vec3& V, const RangeDopplerParams& params, Vec3& X);

/// Ground-point record: the block of one geolocation.
struct grpt_rec {
  std::array<Vec3, 5> state_vectors{};  ///< in: Earth-fixed positions, m
  double t0 = 0.0;            ///< in: time of the first state vector, s (any scale, as azimuth_time)
  double dt = 0.0;            ///< in: spacing of the state vectors, s
  double azimuth_time = 0.0;  ///< in: wanted time, s
  double tau = 0.0;           ///< in: two-way slant time, s
  double fdc = 0.0;           ///< in: Doppler centroid, Hz
  double wavelength = 0.0;    ///< in: m
  double side = 1.0;          ///< in: +1 right-looking, -1 left-looking
  double height = 0.0;        ///< in: height above the ellipsoid, m
  double x = 0.0, y = 0.0, z = 0.0;  ///< out: ground point, m
  double latitude = 0.0;      ///< out: degrees, geodetic
  double longitude = 0.0;     ///< out: degrees
  double heading = 0.0;       ///< out: degrees, signed, clockwise from north
  double incidence = 0.0;     ///< out: degrees at the target against the geocentric vertical
  double look = 0.0;          ///< out: degrees at the satellite against the geocentric vertical
  double ground_velocity = 0.0;  ///< out: m/s
  double beam_velocity = 0.0;    ///< out: m/s
  double doppler_rate = 0.0;     ///< out: Hz/s
};

/// A record for zero-Doppler points on the ellipsoid of a right-looking sensor, from five
/// state vectors (x, y, z each, m) starting at t0, dt apart; the caller sets azimuth_time and tau.
grpt_rec zero_doppler_record(std::span<const double, 15> positions, double t0, double dt, double wavelength);

/// Geolocate from the record's five state vectors: fit, evaluate at the azimuth time and run
/// gr_pt_lat_lon_s_osculated; fills the beam velocity. Returns 0, -1 when the azimuth time is
/// more than dt/2 outside the state vectors, or gr_pt's status.
int gr_pt_lat_lon(grpt_rec& rec, double a = kWgs84A, double b = kWgs84B);
/// From one state (P, V Earth-fixed); Doppler rate from the central-force model.
int gr_pt_lat_lon_s(grpt_rec& rec, const Vec3& P, const Vec3& V, double a = kWgs84A, double b = kWgs84B);
/// From one state with its acceleration A; Doppler rate from the osculating circle.
int gr_pt_lat_lon_s_osculated(grpt_rec& rec, const Vec3& P, const Vec3& V, const Vec3& A, double a = kWgs84A,
                              double b = kWgs84B);

/// Result of the inverse problem.
struct InverseResult {
  double time = 0.0;  ///< s from the first state vector (polynomial time)
  double tau = 0.0;   ///< two-way slant time, s
};

/// Time at which the target X is seen at Doppler fdc, and its slant time, from equally spaced
/// state vectors (five for inv_grpt, any number from two for inv_grpt_NSV). Returns 0 or 12
/// when the Newton iteration leaves the span of the state vectors.
int inv_grpt(std::span<const Vec3> state_vectors, const Vec3& X, double dt, double wavelength, double fdc,
             InverseResult& out);
int inv_grpt_NSV(std::span<const Vec3> state_vectors, const Vec3& X, double dt, double wavelength, double fdc,
                 InverseResult& out);
/// The same from a ready orbit polynomial valid over 0 .. span seconds: no allocation, no refit.
int inv_grpt_opt(const OrbitPolynomial& poly, const Vec3& X, double span, double wavelength, double fdc,
                 InverseResult& out);
int inv_grpt_opt_NSV(const OrbitPolynomial& poly, const Vec3& X, double span, double wavelength, double fdc,
                     InverseResult& out);

/// Bowring's one-step geodetic latitude and the longitude of X, radians, on the ellipsoid (a, b).
void xyz2geo(const Vec3& X, double& latitude, double& longitude, double a = kWgs84A, double b = kWgs84B);
/// WGS84 Earth-fixed point of a geodetic latitude, longitude (radians) and height (m).
Vec3 geo2cart(double latitude, double longitude, double height);
/// True argument of latitude (radians) of the osculating orbit of (P, V), inertial.
double Otrulat(const Vec3& P, const Vec3& V);

/// Entry for the jobs: geolocate the slant time tau (s) at the azimuth time (sec85) from an
/// orbit file, through five interpolated state vectors `sv_step` seconds apart centred on the
/// azimuth time. The record's in-fields other than the state vectors, t0 and dt must be set.
/// Throws OrbitError when the azimuth time is outside the orbit; returns gr_pt_lat_lon's status.
int geolocate(const OrbitData& orbit, grpt_rec& rec, double sv_step = 10.0);

}  // namespace sar::geometry

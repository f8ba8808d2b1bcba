#pragma once
// A circular orbit around a rotating Earth, in closed form, for tests that need the truth.
#include <cmath>
#include <numbers>
#include <string>

#include "geometry/geolocation.hpp"
#include "geometry/orbit_file.hpp"

namespace sar::geometry::testing {

struct CircularOrbit {
  double radius = 7159500.0;                     // m, ENVISAT-like
  double inclination = 98.55 * std::numbers::pi / 180.0;     // rad
  double node_longitude = 0.3;                   // rad, inertial right ascension of the node
  double u0 = -0.4;                              // rad, argument of latitude at t_ref
  double t_ref = 7.0e8;                          // sec85
  double rotation = kEarthRotation;              // rad/s of the Earth-fixed frame

  double mean_motion() const { return std::sqrt(kGravityConstant / (radius * radius * radius)); }

  /// Inertial position and velocity at time t.
  void inertial(double t, Vec3& p, Vec3& v) const {
    const double u = u0 + mean_motion() * (t - t_ref);
    const double cu = std::cos(u), su = std::sin(u), ci = std::cos(inclination), si = std::sin(inclination);
    const double co = std::cos(node_longitude), so = std::sin(node_longitude);
    const Vec3 e1{co, so, 0.0}, e2{-so * ci, co * ci, si};
    const double n = mean_motion();
    p = (radius * cu) * e1 + (radius * su) * e2;
    v = (-radius * n * su) * e1 + (radius * n * cu) * e2;
  }
  /// Earth-fixed state: the frame turns by rotation * (t - t_ref).
  StateVector earth_fixed(double t) const {
    Vec3 p, v;
    inertial(t, p, v);
    const double th = rotation * (t - t_ref), c = std::cos(th), s = std::sin(th);
    StateVector sv;
    sv.time = t;
    sv.position = {c * p[0] + s * p[1], -s * p[0] + c * p[1], p[2]};
    const Vec3 rel{v[0] + rotation * p[1], v[1] - rotation * p[0], v[2]};  // v - omega x p
    sv.velocity = {c * rel[0] + s * rel[1], -s * rel[0] + c * rel[1], rel[2]};
    return sv;
  }
  /// A table of records in the ENVISAT family, `count` records `step` s apart from t_ref + t_first.
  OrbitData table(double t_first, double step, int count) const {
    OrbitData d;
    d.path = "synthetic";
    d.product_name = "DOR_VOR_AX";
    for (int k = 0; k < count; ++k) d.vectors.push_back(earth_fixed(t_ref + t_first + k * step));
    d.sensing_start = d.vectors.front().time;
    d.sensing_stop = d.vectors.back().time;
    return d;
  }
};

/// Exact geodetic latitude, longitude (rad) and height (m) on WGS84, by fixed-point iteration.
inline void exact_geodetic(const Vec3& x, double& lat, double& lon, double& h) {
  const double a = kWgs84A, b = kWgs84B, e2 = 1.0 - b * b / (a * a);
  const double p = std::hypot(x[0], x[1]);
  lon = std::atan2(x[1], x[0]);
  lat = std::atan2(x[2], p * (1.0 - e2));
  for (int i = 0; i < 20; ++i) {
    const double n = a / std::sqrt(1.0 - e2 * std::sin(lat) * std::sin(lat));
    h = p / std::cos(lat) - n;
    lat = std::atan2(x[2], p * (1.0 - e2 * n / (n + h)));
  }
  const double n = a / std::sqrt(1.0 - e2 * std::sin(lat) * std::sin(lat));
  h = p / std::cos(lat) - n;
}

inline std::string real_file(const char* relative) { return std::string(SAR_REAL_DATA_DIR) + "/" + relative; }
inline const char* kVor = "DOR_VOR_AX/DOR_VOR_AXVF-P20080331_075200_20080301_215527_20080303_002327";
inline const char* kPor = "DOR_POR_AX/DOR_POR_AXVF-P20080404_014700_20080401_215527_20080403_002327";

}  // namespace sar::geometry::testing

#include "simulator/orbit_model.hpp"

#include <algorithm>
#include <stdexcept>

namespace sar::simulator {

namespace {
constexpr double kDeg = kPi / 180.0;

double wrap_two_pi(double a) {
  a = std::fmod(a, 2.0 * kPi);
  return a < 0.0 ? a + 2.0 * kPi : a;
}
}  // namespace

Vec3 geodetic_to_ecef(const Geodetic& g) {
  const double e2 = 1.0 - (kWgs84B * kWgs84B) / (kWgs84A * kWgs84A);
  const double lat = g.lat_deg * kDeg, lon = g.lon_deg * kDeg;
  const double n = kWgs84A / std::sqrt(1.0 - e2 * std::sin(lat) * std::sin(lat));
  return {(n + g.height) * std::cos(lat) * std::cos(lon), (n + g.height) * std::cos(lat) * std::sin(lon),
          (n * (1.0 - e2) + g.height) * std::sin(lat)};
}

Geodetic ecef_to_geodetic(const Vec3& p) {
  const double e2 = 1.0 - (kWgs84B * kWgs84B) / (kWgs84A * kWgs84A);
  const double rho = std::hypot(p.x, p.y);
  double lat = std::atan2(p.z, rho * (1.0 - e2));
  double h = 0.0;
  for (int i = 0; i < 10; ++i) {  // fixed-point iteration, converges to micrometres in a few steps
    const double n = kWgs84A / std::sqrt(1.0 - e2 * std::sin(lat) * std::sin(lat));
    h = std::abs(std::cos(lat)) > 1e-9 ? rho / std::cos(lat) - n : std::abs(p.z) - n * (1.0 - e2);
    lat = std::atan2(p.z, rho * (1.0 - e2 * n / (n + h)));
  }
  return {lat / kDeg, std::atan2(p.y, p.x) / kDeg, h};
}

StateVector OrbitModel::state_at_offset(double dt) const {
  const double inc = e_.inclination_deg * kDeg;
  const double u = e_.arg_latitude + e_.mean_motion * dt;
  const double w_rate = e_.node_rate - kEarthRotation;  // node longitude as seen from the Earth
  const double w = e_.node_longitude + w_rate * dt;
  const double cu = std::cos(u), su = std::sin(u), cw = std::cos(w), sw = std::sin(w);
  const double ci = std::cos(inc), si = std::sin(inc);
  const double r = radius(u);
  const double r_rate = -e_.radius_dip * si * si * std::sin(2.0 * u) * e_.mean_motion;
  const Vec3 radial{cu * cw - su * ci * sw, cu * sw + su * ci * cw, su * si};
  const Vec3 du{-su * cw - cu * ci * sw, -su * sw + cu * ci * cw, cu * si};
  const Vec3 dw{-cu * sw - su * ci * cw, cu * cw - su * ci * sw, 0.0};
  StateVector s;
  s.time = e_.epoch + dt;
  s.position = radial * r;
  s.velocity = radial * r_rate + du * (r * e_.mean_motion) + dw * (r * w_rate);
  return s;
}

double OrbitModel::radius(double u) const {
  const double si = std::sin(e_.inclination_deg * kDeg), su = std::sin(u);
  return e_.semi_major_axis - e_.radius_dip * si * si * su * su;
}

int OrbitModel::absolute_orbit(double sec85) const {
  const double u = e_.arg_latitude + e_.mean_motion * (sec85 - e_.epoch);
  return e_.orbit_number + static_cast<int>(std::floor(u / (2.0 * kPi)));
}

double OrbitModel::ascending_node_before(double sec85) const {
  const double u = e_.arg_latitude + e_.mean_motion * (sec85 - e_.epoch);
  const double k = std::floor(u / (2.0 * kPi));
  return e_.epoch + (2.0 * kPi * k - e_.arg_latitude) / e_.mean_motion;
}

OrbitModel OrbitModel::for_scene(const Geodetic& target, double time, double incidence_deg, bool ascending,
                                 int orbit_number) {
  OrbitElements e;
  e.epoch = time;
  e.orbit_number = orbit_number;
  const Vec3 p = geodetic_to_ecef(target);
  const Vec3 ph = p.unit();
  const double inc = e.inclination_deg * kDeg;
  const double lat_c = std::asin(ph.z), lon = std::atan2(ph.y, ph.x);
  // Radius of the orbit where it passes the target's latitude.
  const double sin_u = std::min(1.0, std::abs(ph.z) / std::sin(inc));
  const double orbit_radius = OrbitModel(e).radius(std::asin(sin_u));
  // Earth angle between nadir and target for the wanted incidence (triangle centre, satellite, target).
  const double look = std::asin(p.norm() / orbit_radius * std::sin(incidence_deg * kDeg));
  const double delta = incidence_deg * kDeg - look;
  // Orbit normal h(W) = (sin i sin W, -sin i cos W, cos i); a right-looking radar has the target
  // on the side opposite to h: h . p = -sin(delta).
  const double q = (-std::sin(delta) - std::cos(inc) * std::sin(lat_c)) / (std::sin(inc) * std::cos(lat_c));
  if (std::abs(q) > 1.0) throw std::runtime_error("scene latitude out of reach of the orbit");
  for (const double offset : {std::asin(q), kPi - std::asin(q)}) {
    const double w = lon + offset;
    const Vec3 h{std::sin(inc) * std::sin(w), -std::sin(inc) * std::cos(w), std::cos(inc)};
    const Vec3 s = (ph - h * ph.dot(h)).unit();
    const Vec3 e1{std::cos(w), std::sin(w), 0.0};
    const Vec3 e2 = h.cross(e1);
    const double u = std::atan2(s.dot(e2), s.dot(e1));
    if ((std::cos(u) > 0.0) != ascending) continue;
    e.arg_latitude = wrap_two_pi(u);
    e.node_longitude = w;
    break;
  }
  // The Earth's rotation tilts the zero-Doppler plane: shift the orbit in time so that the
  // target is seen at zero Doppler exactly at `time`. A time shift leaves the track unchanged.
  OrbitModel first(e);
  const double shift = zero_doppler_offset(first, p, 0.0);
  e.arg_latitude += e.mean_motion * shift;
  e.node_longitude += (e.node_rate - kEarthRotation) * shift;
  const double turns = std::floor(e.arg_latitude / (2.0 * kPi));
  e.arg_latitude -= turns * 2.0 * kPi;
  e.orbit_number += static_cast<int>(turns);
  return OrbitModel(e);
}

double zero_doppler_offset(const OrbitModel& orbit, const Vec3& point, double guess_offset) {
  auto f = [&](double dt) {
    const StateVector s = orbit.state_at_offset(dt);
    return (point - s.position).dot(s.velocity);
  };
  const double limit = orbit.period() / 4.0;
  double step = 1.0;
  double a = guess_offset - step, b = guess_offset + step;
  double fa = f(a), fb = f(b);
  while (fa * fb > 0.0) {
    step *= 2.0;
    if (step > limit) throw std::runtime_error("no zero-Doppler time near the scene");
    a = guess_offset - step;
    b = guess_offset + step;
    fa = f(a);
    fb = f(b);
  }
  for (int i = 0; i < 200 && b - a > 1e-9; ++i) {
    const double m = 0.5 * (a + b);
    const double fm = f(m);
    if ((fm > 0.0) == (fa > 0.0)) {
      a = m;
      fa = fm;
    } else {
      b = m;
    }
  }
  return 0.5 * (a + b);
}

}  // namespace sar::simulator

#include "simulator/attitude.hpp"

#include <algorithm>
#include <array>
#include <stdexcept>

namespace sar::simulator {

namespace {

constexpr double kDeg = kPi / 180.0;
constexpr int kAngleBisections = 64;     // the look angle to far below a nanoradian
constexpr int kSquintBisections = 80;
constexpr double kMaxSquint = 0.2;       // rad
constexpr double kTimeTolerance = 1e-9;  // s
constexpr double kRateStep = 2.0;        // s, stencil step of the range's second derivative

using Mat3 = std::array<std::array<double, 3>, 3>;

Mat3 multiply(const Mat3& a, const Mat3& b) {
  Mat3 c{};
  for (int i = 0; i < 3; ++i)
    for (int j = 0; j < 3; ++j)
      for (int k = 0; k < 3; ++k) c[i][j] += a[i][k] * b[k][j];
  return c;
}

/// Inertial velocity of an Earth-fixed state, in the Earth-fixed axes of the same instant.
Vec3 inertial_velocity(const StateVector& s) {
  return {s.velocity.x - kEarthRotation * s.position.y, s.velocity.y + kEarthRotation * s.position.x, s.velocity.z};
}

double wrap_two_pi(double a) {
  a = std::fmod(a, 2.0 * kPi);
  return a < 0.0 ? a + 2.0 * kPi : a;
}

double latitude_argument(const StateVector& s) {
  const Vec3 h = s.position.cross(inertial_velocity(s)).unit();
  const Vec3 node = Vec3{0.0, 0.0, 1.0}.cross(h).unit();
  const Vec3 r = s.position.unit();
  return wrap_two_pi(std::atan2(r.dot(h.cross(node)), r.dot(node)));
}

AttitudeAngles law(const Attitude& a, double u) {
  if (!a.yaw_steering) return {};
  const double p = a.p_deg * kDeg, cu = std::cos(u);
  return {p * (1.0 - p * p * cu * cu / 3.0) * cu + a.yaw_bias_rad, a.q_deg * kDeg * std::sin(2.0 * u),
          a.r_deg * kDeg * std::sin(u)};
}

AntennaFrame frame_at_offset(const OrbitModel& orbit, const Attitude& attitude, double offset) {
  const StateVector s = orbit.state_at_offset(offset);
  AntennaFrame f;
  f.position = s.position;
  f.squint = attitude.squint_rad;
  if (!attitude.yaw_steering) {
    // Ideal zero-Doppler steering: the azimuth axis is the Earth-fixed velocity.
    f.x = s.velocity.unit();
    f.z = (s.position - f.x * s.position.dot(f.x)).unit();
    f.y = f.z.cross(f.x);
    return f;
  }
  const Vec3 zo = s.position.unit();
  const Vec3 xo = s.position.cross(inertial_velocity(s)).cross(s.position).unit();
  const Vec3 yo = zo.cross(xo);
  const AttitudeAngles g = law(attitude, latitude_argument(s));
  const double cy = std::cos(g.yaw), sy = std::sin(g.yaw), cp = std::cos(g.pitch), sp = std::sin(g.pitch);
  const double cr = std::cos(g.roll), sr = std::sin(g.roll);
  const Mat3 ryaw{{{cy, sy, 0.0}, {-sy, cy, 0.0}, {0.0, 0.0, 1.0}}};
  const Mat3 rpitch{{{cp, 0.0, sp}, {0.0, 1.0, 0.0}, {-sp, 0.0, cp}}};
  const Mat3 rroll{{{1.0, 0.0, 0.0}, {0.0, cr, sr}, {0.0, -sr, cr}}};
  const Mat3 r = multiply(rroll, multiply(rpitch, ryaw));
  // Antenna coordinates are r times orbital coordinates, so antenna axis k is sum_j r[k][j] o_j.
  const Vec3 o[3] = {xo, yo, zo};
  Vec3* axes[3] = {&f.x, &f.y, &f.z};
  for (int k = 0; k < 3; ++k) *axes[k] = o[0] * r[k][0] + o[1] * r[k][1] + o[2] * r[k][2];
  return f;
}

double ellipsoid(const Vec3& p) {
  return (p.x * p.x + p.y * p.y) / (kWgs84A * kWgs84A) + p.z * p.z / (kWgs84B * kWgs84B) - 1.0;
}

/// Point of the beam-centre cone at slant range `range`: the look angle in the antenna's
/// cross-track plane is the root of the ellipsoid equation, found by bisection.
Vec3 cone_point(const AntennaFrame& f, double range) {
  const double cs = std::cos(f.squint), ss = std::sin(f.squint);
  auto at = [&](double beta) {
    return f.position + f.x * (range * ss) - f.y * (range * cs * std::sin(beta)) - f.z * (range * cs * std::cos(beta));
  };
  double lo = 0.0, hi = kPi / 2.0;
  if (!(ellipsoid(at(lo)) < 0.0) || !(ellipsoid(at(hi)) > 0.0))
    throw std::runtime_error("the slant range does not reach the Earth in the beam centre");
  for (int i = 0; i < kAngleBisections; ++i) {
    const double mid = 0.5 * (lo + hi);
    (ellipsoid(at(mid)) < 0.0 ? lo : hi) = mid;
  }
  return at(0.5 * (lo + hi));
}

double doppler_at_offset(const OrbitModel& orbit, double offset, const Vec3& target, double wavelength) {
  const StateVector s = orbit.state_at_offset(offset);
  const Vec3 d = target - s.position;
  return 2.0 / wavelength * d.dot(s.velocity) / d.norm();
}

double rate_at_offset(const OrbitModel& orbit, double offset, const Vec3& target, double wavelength) {
  auto range = [&](double k) { return (target - orbit.state_at_offset(offset + k * kRateStep).position).norm(); };
  const double second =
      (-range(2.0) + 16.0 * range(1.0) - 30.0 * range(0.0) + 16.0 * range(-1.0) - range(-2.0)) / (12.0 * kRateStep * kRateStep);
  return -2.0 / wavelength * second;
}

}  // namespace

AttitudeAngles attitude_angles(const OrbitModel& orbit, const Attitude& attitude, double t) {
  return law(attitude, argument_of_latitude(orbit, t));
}

double argument_of_latitude(const OrbitModel& orbit, double t) {
  return latitude_argument(orbit.state_at_offset(t - orbit.elements().epoch));
}

AntennaFrame antenna_frame(const OrbitModel& orbit, const Attitude& attitude, double t) {
  return frame_at_offset(orbit, attitude, t - orbit.elements().epoch);
}

AntennaFrame antenna_frame_at_offset(const OrbitModel& orbit, const Attitude& attitude, double offset) {
  return frame_at_offset(orbit, attitude, offset);
}

double azimuth_off_boresight(const AntennaFrame& f, const Vec3& target) {
  const Vec3 d = target - f.position;
  return std::asin(std::clamp(d.dot(f.x) / d.norm(), -1.0, 1.0)) - f.squint;
}

double azimuth_off_boresight(const OrbitModel& orbit, const Attitude& attitude, double t, const Vec3& target) {
  return azimuth_off_boresight(antenna_frame(orbit, attitude, t), target);
}

Vec3 beam_centre_point(const OrbitModel& orbit, const Attitude& attitude, double t, double tau) {
  return cone_point(antenna_frame(orbit, attitude, t), 0.5 * kSpeedOfLight * tau);
}

double beam_centre_doppler(const OrbitModel& orbit, const Attitude& attitude, double t, double tau,
                           double wavelength) {
  const double offset = t - orbit.elements().epoch;
  return doppler_at_offset(orbit, offset, cone_point(frame_at_offset(orbit, attitude, offset), 0.5 * kSpeedOfLight * tau),
                           wavelength);
}

double beam_centre_doppler_rate(const OrbitModel& orbit, const Attitude& attitude, double t, double tau,
                                double wavelength) {
  const double offset = t - orbit.elements().epoch;
  return rate_at_offset(orbit, offset, cone_point(frame_at_offset(orbit, attitude, offset), 0.5 * kSpeedOfLight * tau),
                        wavelength);
}

double target_doppler(const OrbitModel& orbit, double t, const Vec3& target, double wavelength) {
  return doppler_at_offset(orbit, t - orbit.elements().epoch, target, wavelength);
}

double target_doppler_rate(const OrbitModel& orbit, double t, const Vec3& target, double wavelength) {
  return rate_at_offset(orbit, t - orbit.elements().epoch, target, wavelength);
}

double squint_for_centroid(const OrbitModel& orbit, const Attitude& attitude, double t, double tau,
                           double wavelength, double fdc_hz) {
  Attitude a = attitude;
  auto miss = [&](double squint) {
    a.squint_rad = squint;
    return beam_centre_doppler(orbit, a, t, tau, wavelength) - fdc_hz;
  };
  double lo = -kMaxSquint, hi = kMaxSquint;
  if (!(miss(lo) < 0.0) || !(miss(hi) > 0.0)) throw std::runtime_error("no squint gives the wanted Doppler centroid");
  // The centroid grows with the squint: a forward look closes on the targets faster.
  for (int i = 0; i < kSquintBisections; ++i) {
    const double mid = 0.5 * (lo + hi);
    (miss(mid) < 0.0 ? lo : hi) = mid;
  }
  return 0.5 * (lo + hi);
}

double beam_centre_time(const OrbitModel& orbit, const Attitude& attitude, const Vec3& target, double guess) {
  const double epoch = orbit.elements().epoch;
  const double start = guess - epoch;
  // The target leaves the beam backwards: the angle falls through zero as time goes on.
  auto angle = [&](double offset) { return azimuth_off_boresight(frame_at_offset(orbit, attitude, offset), target); };
  const double limit = orbit.period() / 4.0;
  double step = 1.0;
  double a = start - step, b = start + step;
  while (!(angle(a) > 0.0 && angle(b) <= 0.0)) {
    step *= 2.0;
    if (step > limit) throw std::runtime_error("the target does not cross the beam centre");
    a = start - step;
    b = start + step;
  }
  while (b - a > kTimeTolerance) {
    const double m = 0.5 * (a + b);
    if (m <= a || m >= b) break;
    (angle(m) > 0.0 ? a : b) = m;
  }
  return epoch + 0.5 * (a + b);
}

}  // namespace sar::simulator

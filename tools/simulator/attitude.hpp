#pragma once
// Antenna attitude of the simulated satellite and the Doppler geometry of its beam centre.
//
// Frames. The local orbital frame at time t has x along track (in the orbit plane, orthogonal to
// the position, forward), z radial (up) and y = z x x (left of the track); position and velocity
// are taken inertial (the Earth-fixed velocity plus omega x position). The antenna frame is the
// orbital frame turned by yaw about z, then pitch about the new y, then roll about the new x;
// the coordinates of a vector in it are
//   Rroll Rpitch Ryaw v, Ryaw = [c s 0; -s c 0; 0 0 1], Rpitch = [c 0 s; 0 1 0; -s 0 c],
//   Rroll = [1 0 0; 0 c s; 0 -s c].
// The radar looks right: the beam centre leaves the satellite along
//   (sin squint, -cos squint sin elevation, -cos squint cos elevation)
// in antenna coordinates, so a positive squint looks forward and raises the Doppler. The
// beam-centre surface is the cone of all directions with that along-track direction cosine;
// a target's azimuth angle off boresight is asin(along-track direction cosine) - squint.
//
// Steering. With yaw steering the attitude follows the law of the argument of latitude u:
//   yaw = p (1 - p^2 cos^2(u) / 3) cos(u), pitch = q sin(2u), roll = r sin(u),
// which keeps the beam near zero Doppler over the orbit. Without it the antenna is steered
// ideally to zero Doppler: the azimuth angle is measured against the plane orthogonal to the
// Earth-fixed velocity, whatever the time.
//
// Doppler is -(2 / wavelength) dR/dt of a target fixed on the Earth, positive when closing.
// Ground points are intersections with the WGS84 ellipsoid.
#include "simulator/orbit_model.hpp"

namespace sar::simulator {

struct Attitude {
  bool yaw_steering = true;
  double p_deg = 3.912987;  // yaw amplitude
  double q_deg = -0.167074; // pitch amplitude
  double r_deg = 0.050233;  // roll amplitude
  double elevation_deg = 23.0;  // boresight elevation off the antenna's nadir axis
  double squint_rad = 0.0;      // azimuth angle of the beam centre, positive forward
  double yaw_bias_rad = 0.0;    // a yaw error on top of the law (yaw steering only)
};

/// Yaw, pitch and roll (rad) at time t (zero without yaw steering).
struct AttitudeAngles {
  double yaw = 0.0, pitch = 0.0, roll = 0.0;
};
AttitudeAngles attitude_angles(const OrbitModel& orbit, const Attitude& attitude, double t);

/// Argument of latitude (rad, 0 .. 2 pi) of the satellite at time t, from its inertial state.
double argument_of_latitude(const OrbitModel& orbit, double t);

/// Angle of a target off the beam-centre surface in azimuth (rad), at time t (sec85);
/// positive ahead of the beam centre.
double azimuth_off_boresight(const OrbitModel& orbit, const Attitude& attitude, double t, const Vec3& target);

/// The antenna axes at one time, Earth-fixed unit vectors: x along track (the azimuth axis), y
/// left, z up. Built once per line, it answers azimuth_off_boresight for many targets.
struct AntennaFrame {
  Vec3 position;      // satellite, Earth-fixed, m
  Vec3 x, y, z;       // antenna axes
  double squint = 0.0;
};
AntennaFrame antenna_frame(const OrbitModel& orbit, const Attitude& attitude, double t);
/// The same at `offset` s after the orbit epoch (full precision near the scene).
AntennaFrame antenna_frame_at_offset(const OrbitModel& orbit, const Attitude& attitude, double offset);
double azimuth_off_boresight(const AntennaFrame& frame, const Vec3& target);

/// The point of the ellipsoid at two-way time tau on the beam-centre surface at time t, right of
/// the track. Throws std::runtime_error when the range does not reach the Earth.
Vec3 beam_centre_point(const OrbitModel& orbit, const Attitude& attitude, double t, double tau);

/// Doppler centroid (Hz, absolute, not folded by the PRF) of the beam centre at two-way time tau,
/// and the Doppler rate (Hz/s) of a target fixed there.
double beam_centre_doppler(const OrbitModel& orbit, const Attitude& attitude, double t, double tau, double wavelength);
double beam_centre_doppler_rate(const OrbitModel& orbit, const Attitude& attitude, double t, double tau,
                                double wavelength);

/// Doppler (Hz) and Doppler rate (Hz/s) of a target fixed on the Earth, seen at time t.
double target_doppler(const OrbitModel& orbit, double t, const Vec3& target, double wavelength);
double target_doppler_rate(const OrbitModel& orbit, double t, const Vec3& target, double wavelength);

/// Squint (rad) that puts the beam-centre Doppler at fdc_hz at (t, tau), other fields of
/// `attitude` kept. Throws std::runtime_error when no squint within +-0.2 rad does.
double squint_for_centroid(const OrbitModel& orbit, const Attitude& attitude, double t, double tau,
                           double wavelength, double fdc_hz);

/// Time (sec85) at which a fixed target crosses the beam centre, searched from `guess` within
/// a quarter orbit. Throws std::runtime_error when there is no crossing.
double beam_centre_time(const OrbitModel& orbit, const Attitude& attitude, const Vec3& target, double guess);

}  // namespace sar::simulator

#pragma once
// Satellite position and velocity at any time inside an orbit file.
//
// ENVISAT-format orbits: nine records around the wanted time, Lagrange interpolation of the
// positions and, separately, of the velocities. Text orbits: the degree 4 polynomial through
// five records around the wanted time, the velocity its derivative. A time outside the file's
// valid interval is refused (OrbitError kOutsideSpan), never extrapolated.
#include <span>
#include <string>
#include <vector>

#include "geometry/orbit_file.hpp"

namespace sar::geometry {

/// What to sample around the wanted time t.
struct OrbitInterpParams {
  int count = 1;                ///< number of epochs, centred on t
  double step = 0.0;            ///< s between epochs: epoch i is t + (i - (count - 1) / 2) * step
  bool velocity = true;         ///< also give velocities
  bool ascending_node = false;  ///< also find the last ascending equator crossing before t
};

/// Samples of the orbit.
struct OrbitSamples {
  std::vector<double> times;       ///< sec85
  std::vector<Vec3> positions;     ///< Earth-fixed, m
  std::vector<Vec3> velocities;    ///< Earth-fixed, m/s (empty unless asked for)
  int orbit_number = 0;            ///< of the record nearer to t (ENVISAT format only)
  double node_time = 0.0;          ///< sec85 of the ascending node, when asked for
};

/// Sample the orbit at `params.count` epochs centred on t (sec85). Throws OrbitError:
/// kOutsideSpan when t or a sample epoch leaves the file's interval, kNoNodeOrHeader when the
/// node is asked for and no crossing precedes t (message "Cannot compute ascending node time:
/// no change in orbit number").
OrbitSamples interpolate_orbit(const OrbitData& orbit, double t, const OrbitInterpParams& params = {});

/// Position and velocity at one time t (sec85); throws OrbitError kOutsideSpan outside the file.
StateVector orbit_state_at(const OrbitData& orbit, double t);

/// `count` raw records, in order, from the record before the first epoch not below t; fewer
/// when the file ends first. Throws OrbitError kOutsideSpan for t outside the sensing interval.
std::vector<StateVector> nearest_state_vectors(const OrbitData& orbit, double t, int count);

/// Lagrange interpolation through nodes (epochs, values) at time t; a t that equals a node
/// returns that node's value unchanged. Nodes need not be equally spaced.
Vec3 lagrange_interpolate(std::span<const double> epochs, std::span<const Vec3> values, double t);
/// Time derivative of the same interpolating polynomial.
Vec3 lagrange_derivative(std::span<const double> epochs, std::span<const Vec3> values, double t);

// --- Status-style entry points (0 or an orbit_status code; no exceptions) --------------------

/// Read the orbit file at `path` (any family) and sample it as interpolate_orbit does.
/// `positions` holds 3 * n doubles; `velocities` is empty or 3 * n doubles; `orbit_number`
/// and `node_time` may be null; node_flag 1 asks for the ascending node.
int interp_orb_l(const std::string& path, double t, int n, double dt, std::span<double> positions,
                 std::span<double> velocities, int* orbit_number, int node_flag, double* node_time);

/// Raw records around t: positions, velocities (3 * n doubles each) and epochs (n doubles).
/// Returns 0, 12, 13, or the number of records copied when the file ends early.
int get_state_vectors(const std::string& path, double t, int n, std::span<double> positions,
                      std::span<double> velocities, std::span<double> epochs);

/// The text orbit, sampled like interp_orb_l (velocities may be empty).
int interp_orb_l_v2(const std::string& path, double t, int n, double dt, std::span<double> positions,
                    std::span<double> velocities);

/// Nine-point Lagrange on a table: `table` 9 x 3 values, `epochs` 9, outputs n x 3 at `times`.
int interp_orb_Lagrange(std::span<const double> table, std::span<const double> epochs, std::span<double> output,
                        std::span<const double> times);

}  // namespace sar::geometry

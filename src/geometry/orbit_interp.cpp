#include "geometry/orbit_interp.hpp"

#include <algorithm>
#include <cmath>
#include <cstdint>
#include <cstdio>
#include <optional>
#include <string>

#include "base/convert.hpp"

namespace sar::geometry {

namespace {

constexpr std::size_t kEnvisatWindow = 9;
constexpr std::size_t kTextWindow = 5;
// The node is searched in the three minutes before the record behind the crossing.
constexpr double kNodeSearchSpan = 180.0;
constexpr double kNodeTolerance = 1e-5;

std::string utc_text(double t) {
  std::string text;
  if (base::sec852myascii(t, text) != 0) {
    char number[48];
    std::snprintf(number, sizeof number, "%.6f (sec85)", t);
    return number;
  }
  return text;
}

[[noreturn]] void outside(const OrbitData& orbit, double t, const char* what) {
  char text[200];
  std::snprintf(text, sizeof text, "%s %s outside the orbit interval %s to %s", what, utc_text(t).c_str(),
                utc_text(orbit.sensing_start).c_str(), utc_text(orbit.sensing_stop).c_str());
  OrbitError e(orbit_status::kOutsideSpan, orbit.path, -1, "time", orbit.path + ": " + text);
  e.set_span(orbit.sensing_start, orbit.sensing_stop);
  throw e;
}

void check_inside(const OrbitData& orbit, double t, const char* what) {
  if (orbit.vectors.empty()) throw OrbitError(orbit_status::kMalformed, orbit.path, -1, "record", orbit.path + ": no records");
  // Valid times are the sensing interval, and never beyond the records themselves.
  const double lo = std::max(orbit.sensing_start, orbit.vectors.front().time);
  const double hi = std::min(orbit.sensing_stop, orbit.vectors.back().time);
  if (!(t >= lo && t <= hi)) outside(orbit, t, what);
}

/// First window record for the ENVISAT family. c counts the records read up to and including
/// the first one with an epoch not below t.
std::size_t envisat_window_start(std::size_t c, std::size_t records) {
  if (records <= kEnvisatWindow || c < 5) return 0;
  if (c > records - 5) return records - kEnvisatWindow;
  return c - 5;
}

/// First window record for the text family, from the record nearest to t.
std::size_t text_window_start(std::size_t best, std::size_t records) {
  if (records <= kTextWindow || best <= 1) return 0;
  if (best >= records - 2) return records - kTextWindow;
  return best - 2;
}

struct Window {
  std::vector<double> epochs;  // relative to the first epoch of the window
  std::vector<Vec3> positions, velocities;
  double t0 = 0.0;
};

Window make_window(const OrbitData& orbit, std::size_t start, std::size_t length) {
  Window w;
  length = std::min(length, orbit.vectors.size() - start);
  w.t0 = orbit.vectors[start].time;
  for (std::size_t k = start; k < start + length; ++k) {
    w.epochs.push_back(orbit.vectors[k].time - w.t0);
    w.positions.push_back(orbit.vectors[k].position);
    w.velocities.push_back(orbit.vectors[k].velocity);
  }
  return w;
}

/// Ascending node in the window around `record`: the root of Z(t) in the 180 s before it.
std::optional<double> node_in_window(const OrbitData& orbit, std::size_t record) {
  const Window w = make_window(orbit, envisat_window_start(record + 1, orbit.vectors.size()), kEnvisatWindow);
  const double hi0 = orbit.vectors[record].time - w.t0;
  double lo = std::max(hi0 - kNodeSearchSpan, w.epochs.front());
  double hi = hi0;
  auto z = [&](double s) { return lagrange_interpolate(w.epochs, w.positions, s)[2]; };
  if (z(lo) > 0.0 || z(hi) <= 0.0) return std::nullopt;
  // Bisection: Z rises through 0 between lo and hi.
  for (int it = 0; it < 200 && hi - lo > kNodeTolerance; ++it) {
    const double mid = 0.5 * (lo + hi);
    if (z(mid) <= 0.0) {
      lo = mid;
    } else {
      hi = mid;
    }
  }
  return w.t0 + 0.5 * (lo + hi);
}

}  // namespace

Vec3 lagrange_interpolate(std::span<const double> epochs, std::span<const Vec3> values, double t) {
  const std::size_t n = std::min(epochs.size(), values.size());
  for (std::size_t k = 0; k < n; ++k)
    if (t == epochs[k]) return values[k];
  Vec3 out{0.0, 0.0, 0.0};
  for (std::size_t k = 0; k < n; ++k) {
    double basis = 1.0;
    for (std::size_t j = 0; j < n; ++j)
      if (j != k) basis *= (t - epochs[j]) / (epochs[k] - epochs[j]);
    for (std::size_t a = 0; a < 3; ++a) out[a] += basis * values[k][a];
  }
  return out;
}

Vec3 lagrange_derivative(std::span<const double> epochs, std::span<const Vec3> values, double t) {
  const std::size_t n = std::min(epochs.size(), values.size());
  Vec3 out{0.0, 0.0, 0.0};
  for (std::size_t k = 0; k < n; ++k) {
    double sum = 0.0;
    for (std::size_t m = 0; m < n; ++m) {
      if (m == k) continue;
      double term = 1.0 / (epochs[k] - epochs[m]);
      for (std::size_t j = 0; j < n; ++j)
        if (j != k && j != m) term *= (t - epochs[j]) / (epochs[k] - epochs[j]);
      sum += term;
    }
    for (std::size_t a = 0; a < 3; ++a) out[a] += sum * values[k][a];
  }
  return out;
}

OrbitSamples interpolate_orbit(const OrbitData& orbit, double t, const OrbitInterpParams& params) {
  if (params.count < 1)
    throw OrbitError(orbit_status::kOutsideSpan, orbit.path, -1, "count", orbit.path + ": no epochs asked for");
  check_inside(orbit, t, "time");
  OrbitSamples out;
  out.times.resize(static_cast<std::size_t>(params.count));
  for (int i = 0; i < params.count; ++i) {
    out.times[static_cast<std::size_t>(i)] = (i - (params.count - 1) * 0.5) * params.step + t;
    check_inside(orbit, out.times[static_cast<std::size_t>(i)], "sample time");
  }

  const auto& v = orbit.vectors;
  Window w;
  std::optional<std::size_t> crossing;
  if (orbit.family == OrbitFamily::kEnvisat) {
    // Scan in order up to the first record not before t, noting ascending equator crossings.
    std::size_t c = 0;
    for (std::size_t k = 0; k < v.size(); ++k) {
      c = k + 1;
      const double zPrev = v[k == 0 ? 0 : k - 1].position[2];
      if (zPrev <= 0.0 && v[k].position[2] > 0.0) crossing = k;
      if (v[k].time >= t) break;
    }
    const std::size_t cur = c - 1, prev = c >= 2 ? c - 2 : 0;
    out.orbit_number = (t - v[prev].time >= v[cur].time - t) ? v[cur].orbit_number : v[prev].orbit_number;
    w = make_window(orbit, envisat_window_start(c, v.size()), kEnvisatWindow);
  } else {
    std::size_t best = 0;
    double bestDistance = 1e11;
    for (std::size_t k = 0; k < v.size(); ++k) {
      if (std::fabs(v[k].time - t) < bestDistance) {
        bestDistance = std::fabs(v[k].time - t);
        best = k;
      }
    }
    w = make_window(orbit, text_window_start(best, v.size()), kTextWindow);
  }

  for (double ti : out.times) {
    const double s = ti - w.t0;
    out.positions.push_back(lagrange_interpolate(w.epochs, w.positions, s));
    if (params.velocity)
      out.velocities.push_back(orbit.family == OrbitFamily::kEnvisat ? lagrange_interpolate(w.epochs, w.velocities, s)
                                                                      : lagrange_derivative(w.epochs, w.positions, s));
  }

  if (params.ascending_node) {
    std::optional<double> node;
    if (crossing) node = node_in_window(orbit, *crossing);
    if (!node)
      throw OrbitError(orbit_status::kNoNodeOrHeader, orbit.path, -1, "node",
                       "Cannot compute ascending node time: no change in orbit number");
    out.node_time = *node;
  }
  return out;
}

StateVector orbit_state_at(const OrbitData& orbit, double t) {
  const OrbitSamples s = interpolate_orbit(orbit, t, {});
  StateVector sv;
  sv.time = t;
  sv.orbit_number = s.orbit_number;
  sv.position = s.positions[0];
  sv.velocity = s.velocities[0];
  return sv;
}

std::vector<StateVector> nearest_state_vectors(const OrbitData& orbit, double t, int count) {
  if (!(t >= orbit.sensing_start && t <= orbit.sensing_stop)) outside(orbit, t, "time");
  const auto& v = orbit.vectors;
  std::size_t first = 0;
  while (first < v.size() && v[first].time < t) ++first;
  if (first > 0) --first;  // one record back from the first epoch not below t
  std::vector<StateVector> out;
  for (std::size_t k = first; k < v.size() && out.size() < static_cast<std::size_t>(std::max(count, 0)); ++k)
    out.push_back(v[k]);
  return out;
}

// ---------------------------------------------------------------------------------------------

namespace {

bool fits(std::span<double> s, int n) { return n >= 0 && s.size() >= static_cast<std::size_t>(n) * 3; }

int sample_into(const OrbitData& orbit, double t, int n, double dt, std::span<double> positions,
                std::span<double> velocities, int* orbit_number, bool node, double* node_time) {
  if (n < 1 || !fits(positions, n) || (!velocities.empty() && !fits(velocities, n))) return orbit_status::kOutsideSpan;
  if (node && node_time) *node_time = 0.0;
  OrbitSamples s;
  int status = orbit_status::kOk;
  try {
    s = interpolate_orbit(orbit, t, {n, dt, !velocities.empty(), false});
  } catch (const OrbitError& e) {
    return e.status();
  }
  for (std::size_t i = 0; i < static_cast<std::size_t>(n); ++i)
    for (std::size_t a = 0; a < 3; ++a) {
      positions[3 * i + a] = s.positions[i][a];
      if (!velocities.empty()) velocities[3 * i + a] = s.velocities[i][a];
    }
  if (orbit_number) *orbit_number = s.orbit_number;
  if (node) {
    try {
      const OrbitSamples withNode = interpolate_orbit(orbit, t, {1, 0.0, false, true});
      if (node_time) *node_time = withNode.node_time;
    } catch (const OrbitError& e) {
      status = e.status();
    }
  }
  return status;
}

}  // namespace

int interp_orb_l(const std::string& path, double t, int n, double dt, std::span<double> positions,
                 std::span<double> velocities, int* orbit_number, int node_flag, double* node_time) {
  try {
    const OrbitData orbit = read_orbit(path);
    return sample_into(orbit, t, n, dt, positions, velocities, orbit_number, node_flag == 1, node_time);
  } catch (const OrbitError& e) {
    return e.status();
  }
}

int interp_orb_l_v2(const std::string& path, double t, int n, double dt, std::span<double> positions,
                    std::span<double> velocities) {
  try {
    const OrbitData orbit = read_text_orbit(path);
    return sample_into(orbit, t, n, dt, positions, velocities, nullptr, false, nullptr);
  } catch (const OrbitError& e) {
    return e.status();
  }
}

int get_state_vectors(const std::string& path, double t, int n, std::span<double> positions,
                      std::span<double> velocities, std::span<double> epochs) {
  if (n < 0 || !fits(positions, n) || !fits(velocities, n) || epochs.size() < static_cast<std::size_t>(n))
    return orbit_status::kOutsideSpan;
  try {
    const OrbitData orbit = read_orbit(path);
    const std::vector<StateVector> sv = nearest_state_vectors(orbit, t, n);
    for (std::size_t i = 0; i < sv.size(); ++i) {
      for (std::size_t a = 0; a < 3; ++a) {
        positions[3 * i + a] = sv[i].position[a];
        velocities[3 * i + a] = sv[i].velocity[a];
      }
      epochs[i] = sv[i].time;
    }
    return sv.size() == static_cast<std::size_t>(n) ? orbit_status::kOk : static_cast<int>(sv.size());
  } catch (const OrbitError& e) {
    return e.status();
  }
}

int interp_orb_Lagrange(std::span<const double> table, std::span<const double> epochs, std::span<double> output,
                        std::span<const double> times) {
  if (table.size() < 3 * kEnvisatWindow || epochs.size() < kEnvisatWindow || output.size() < 3 * times.size())
    return orbit_status::kOutsideSpan;
  std::vector<double> rel(kEnvisatWindow);
  std::vector<Vec3> values(kEnvisatWindow);
  for (std::size_t k = 0; k < kEnvisatWindow; ++k) {
    rel[k] = epochs[k] - epochs[0];
    values[k] = {table[3 * k], table[3 * k + 1], table[3 * k + 2]};
  }
  for (std::size_t i = 0; i < times.size(); ++i) {
    const Vec3 p = lagrange_interpolate(rel, values, times[i] - epochs[0]);
    for (std::size_t a = 0; a < 3; ++a) output[3 * i + a] = p[a];
  }
  return orbit_status::kOk;
}

}  // namespace sar::geometry

#include "simulator/ws_clutter.hpp"

#include <algorithm>
#include <cmath>
#include <cstddef>
#include <fstream>
#include <stdexcept>

#include "base/convert.hpp"
#include "simulator/simulator.hpp"

namespace sar::simulator {

namespace {

constexpr double kDegree = kPi / 180.0;

double incidence_of(double rs, double re, double r) {
  const double gamma = std::acos((rs * rs + re * re - r * r) / (2.0 * rs * re));
  return (gamma + std::asin(re * std::sin(gamma) / r)) / kDegree;
}

}  // namespace

double ws_clutter_cell_gain(double r, double r_mid, double r_ref) {
  // Raw power goes as |cell|^2 times the footprint's length (as r): cells of power r^-4 give r^-3.
  return std::sqrt(r_ref * r_ref * r_ref * r_mid) / (r * r);
}

WsClutter::WsClutter(const SimulationConfig& c, const OrbitModel& orbit, const Attitude& attitude,
                     const std::array<WsClutterSwath, 5>& swaths, int reference, double first_offset, double span,
                     const std::vector<WsEchoLine>& lines) {
  if (reference < 0 || reference > 4) throw std::invalid_argument("clutter: reference sub-swath must be 0 to 4");
  if (c.targets.empty()) throw std::invalid_argument("the scene needs at least one target");
  const double fs = c.im.sampling_frequency;
  const double lambda = kSpeedOfLight / c.im.carrier_frequency;
  const double t_mid = base::ascii2sec85(c.scene_time) + first_offset + 0.5 * span;
  const bool steered = attitude.yaw_steering || attitude.squint_rad != 0.0;
  auto mid_range = [&](const WsClutterSwath& s) { return 0.5 * kSpeedOfLight * (s.near_range_time + 0.5 * c.samples / fs); };
  const double r_ref = mid_range(swaths[static_cast<std::size_t>(reference)]);
  samples_ = static_cast<std::size_t>(c.samples);
  lines_.assign(lines.size() * samples_, {});
  for (std::size_t k = 0; k < swaths.size(); ++k) {
    const WsClutterSwath& s = swaths[k];
    ClutterGeometry g;
    g.lines = static_cast<int>(std::ceil(span * s.prf)) + 2;
    g.samples = c.samples;
    g.prf = s.prf;
    g.sampling_frequency = fs;
    g.carrier_frequency = c.im.carrier_frequency;
    g.pulse_length = s.pulse_length;
    g.chirp_bandwidth = s.chirp_bandwidth;
    g.near_range_time = s.near_range_time;
    g.antenna_length = c.im.antenna_length;
    if (steered) {
      g.doppler_centroid = [orbit, attitude, t_mid, lambda](double tau) {
        return beam_centre_doppler(orbit, attitude, t_mid, tau, lambda);
      };
    } else {
      g.doppler_centroid = [](double) { return 0.0; };
    }
    set_orbit_geometry(g, orbit, first_offset + 0.5 * span, c.targets.front().position.height);
    const Reflectivity cells = random_reflectivity(c.clutter, g, c.seed ^ (0x5C1077E4ull + 0x9E3779B97F4A7C15ull * (k + 1)));
    const double near = s.near_range_time, offset = g.sample_offset, r_mid = mid_range(s);
    ClutterEcho echo(g, [cells, near, offset, r_mid, r_ref, fs](long long row, long long first_col,
                                                                std::span<std::complex<float>> out) {
      cells(row, first_col, out);
      for (std::size_t i = 0; i < out.size(); ++i) {
        const double r = 0.5 * kSpeedOfLight * (near + (static_cast<double>(first_col) + static_cast<double>(i) + offset) / fs);
        out[i] *= static_cast<float>(ws_clutter_cell_gain(r, r_mid, r_ref));
      }
    });
    // Lines in increasing time, so that each azimuth block is made once.
    for (std::size_t i = 0; i < lines.size(); ++i) {
      if (lines[i].swath != static_cast<int>(k)) continue;
      const long long l = std::llround(lines[i].offset * s.prf);
      if (l < 0 || l >= g.lines) throw std::invalid_argument("clutter: line outside the product");
      const auto field = echo.line(static_cast<int>(l));
      std::copy(field.begin(), field.end(), lines_.begin() + static_cast<std::ptrdiff_t>(i * samples_));
    }
  }
}

std::span<const std::complex<float>> WsClutter::line(std::size_t index) const {
  return {lines_.data() + index * samples_, samples_};
}

void flatten_elevation_patterns(const std::string& xca_path) {
  // The record follows the main and specific headers; pattern (slot b, polarisation p) starts
  // 4 (201 (4 b + p)) - 2424 bytes into it.
  constexpr long long kRecord = 1247 + 378, kRecordBytes = 26552, kGains = 201, kBias = 2424;
  std::fstream f(xca_path, std::ios::binary | std::ios::in | std::ios::out);
  if (!f) throw std::runtime_error("cannot open " + xca_path);
  const std::vector<char> zeros(4 * kGains, 0);  // 0.0f: 0 dB
  for (long long b = 1; b <= 8; ++b)
    for (long long p = 0; p < 4; ++p) {
      const long long first = 4 * kGains * (4 * b + p) - kBias;
      if (first < 0 || first + 4 * kGains > kRecordBytes) continue;
      f.seekp(kRecord + first);
      f.write(zeros.data(), static_cast<std::streamsize>(zeros.size()));
    }
  if (!f) throw std::runtime_error("cannot write " + xca_path);
}

std::array<double, 5> ws_adjoining_incidences(const SimulationConfig& c, int spacing) {
  if (c.targets.empty()) throw std::invalid_argument("the scene needs at least one target");
  if (spacing < 1) throw std::invalid_argument("the windows' spacing must be positive");
  const double t_scene = base::ascii2sec85(c.scene_time);
  const std::size_t ref = static_cast<std::size_t>(c.ws.target_swath);
  const OrbitModel orbit =
      OrbitModel::for_scene(c.targets.front().position, t_scene, c.ws.swaths.at(ref).incidence_deg, c.ascending, c.orbit_number);
  const double rs = orbit.state(t_scene).position.norm();
  const Vec3 target = geodetic_to_ecef(c.targets.front().position);
  const double re = target.norm();
  // The target sub-swath's window is centred on the first target's echo at zero Doppler.
  const double r_ref = (target - orbit.state_at_offset(zero_doppler_offset(orbit, target, 0.0)).position).norm();
  // Each window is centred on the echo of its incidence: centres `spacing` samples apart.
  const double step = 0.5 * kSpeedOfLight * spacing / c.im.sampling_frequency;
  std::array<double, 5> inc{};
  for (std::size_t k = 0; k < inc.size(); ++k)
    inc[k] = incidence_of(rs, re, r_ref + (static_cast<double>(k) - static_cast<double>(ref)) * step);
  return inc;
}

}  // namespace sar::simulator

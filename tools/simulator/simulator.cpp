#include "simulator/simulator.hpp"

#include <algorithm>
#include <cmath>
#include <complex>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <optional>
#include <random>
#include <stdexcept>

#include "base/convert.hpp"
#include "simulator/aux_files.hpp"
#include "simulator/fbaq_encoder.hpp"
#include "simulator/header_text.hpp"
#include "simulator/level0_packet.hpp"
#include "simulator/orbit_file.hpp"
#include "simulator/truth_file.hpp"

namespace sar::simulator {

namespace {

constexpr std::size_t kLevel0SphBytes = 1956;
constexpr std::size_t kPacketAreaOffset = kMphBytes + kLevel0SphBytes;  // 3203
constexpr int kInitialCalibrationPackets = 105;
constexpr int kCycleLines = 1024;  // 1023 echoes and one periodic calibration pulse
constexpr double kBandwidthStep = 62745.098039215685;  // 16 MHz in 255 steps
constexpr double kDeg = kPi / 180.0;

int cycle_position(long long counter) {
  return counter < kInitialCalibrationPackets
             ? static_cast<int>(counter)
             : static_cast<int>((counter - kInitialCalibrationPackets) % kCycleLines);
}

bool is_calibration_slot(long long counter) {
  return counter >= kInitialCalibrationPackets && cycle_position(counter) == kCycleLines - 1;
}

bool has_fault(const SimulationConfig& c, Fault f) {
  return std::find(c.faults.begin(), c.faults.end(), f) != c.faults.end();
}

int64_t to_mjd_us(double sec85) { return std::llround((sec85 - base::kSec85AtMjd2000) * 1e6); }
double from_mjd_us(int64_t us) { return base::kSec85AtMjd2000 + static_cast<double>(us) * 1e-6; }

double sinc(double x) { return std::abs(x) < 1e-12 ? 1.0 : std::sin(kPi * x) / (kPi * x); }

// Mode packet counter of the first packet: mid-cycle, so that a product of a few hundred lines
// holds a periodic calibration pulse; neither the first nor the last packet is one.
long long choose_first_counter(const SimulationConfig& c) {
  long long first = c.first_counter >= 0 ? c.first_counter : kInitialCalibrationPackets + 9LL * kCycleLines + 700;
  if (has_fault(c, Fault::kSequenceWrap)) first = 16384 - c.lines / 2;
  if (first < kInitialCalibrationPackets) throw std::invalid_argument("first packet inside the initial calibration");
  for (int guard = 0; guard < 4; ++guard) {
    if (is_calibration_slot(first)) ++first;
    else if (is_calibration_slot(first + c.lines - 1)) --first;
    else return first;
  }
  throw std::invalid_argument("no packet counter keeps calibration pulses off the product ends");
}

struct Geometry {
  Vec3 east, north;
};

Geometry local_axes(const Geodetic& g) {
  const double la = g.lat_deg * kDeg, lo = g.lon_deg * kDeg;
  return {{-std::sin(lo), std::cos(lo), 0.0},
          {-std::sin(la) * std::cos(lo), -std::sin(la) * std::sin(lo), std::cos(la)}};
}

std::string build_sph(const SimulationConfig& c, const Geodetic& start, const Geodetic& stop, double track_deg,
                      int missing, long long ds_size, long long num_dsr, const std::string& orbit_name) {
  HeaderText h;
  h.quoted("SPH_DESCRIPTOR", "ASA_IM__0P SPECIFIC HEADER", 28);
  h.plain("START_LAT", signed_int(std::llround(start.lat_deg * 1e6), 10) + "<10-6degN>");
  h.plain("START_LONG", signed_int(std::llround(start.lon_deg * 1e6), 10) + "<10-6degE>");
  h.plain("STOP_LAT", signed_int(std::llround(stop.lat_deg * 1e6), 10) + "<10-6degN>");
  h.plain("STOP_LONG", signed_int(std::llround(stop.lon_deg * 1e6), 10) + "<10-6degE>");
  h.plain("SAT_TRACK", signed_exp(track_deg) + "<deg>");
  h.spare(51);
  h.plain("ISP_ERRORS_SIGNIFICANT", "0");
  h.plain("MISSING_ISPS_SIGNIFICANT", missing > 0 ? "1" : "0");
  h.plain("ISP_DISCARDED_SIGNIFICANT", "0");
  h.plain("RS_SIGNIFICANT", "0");
  h.spare(51);
  const double missing_share = 100.0 * missing / std::max(1, c.lines);
  h.plain("NUM_ERROR_ISPS", signed_int(0, 10));
  h.plain("ERROR_ISPS_THRESH", signed_exp(0.0) + "<%>");
  h.plain("NUM_MISSING_ISPS", signed_int(missing, 10));
  h.plain("MISSING_ISPS_THRESH", signed_exp(missing_share) + "<%>");
  h.plain("NUM_DISCARDED_ISPS", signed_int(0, 10));
  h.plain("DISCARDED_ISPS_THRESH", signed_exp(0.0) + "<%>");
  h.plain("NUM_RS_ISPS", signed_int(0, 10));
  h.plain("RS_THRESH", signed_exp(0.0) + "<%>");
  h.spare(101);
  h.quoted("TX_RX_POLAR", "H/H", 5);
  h.quoted("SWATH", "IS" + std::to_string(c.im.beam_code), 3);
  h.spare(42);
  h.raw(build_dsd({"ASAR_SOURCE_PACKETS", 'M', "", static_cast<long long>(kPacketAreaOffset), ds_size, num_dsr, -1}));
  h.raw(build_dsd({"LEVEL_0_CONFIGURATION_FILE", 'R', "AUX_CN0_AXVPDS20020123_121901_20020101_000000_20200101_000000",
                   0, 0, 0, 0}));
  h.raw(build_dsd({"ORBIT_STATE_VECTOR_FILE", 'R', orbit_name, 0, 0, 0, 0}));
  h.raw(spare_dsd());
  if (h.size() != kLevel0SphBytes) throw std::logic_error("level 0 SPH is not 1956 bytes");
  return h.str();
}

// Offset-binary bytes of a periodic calibration packet: the replica through four calibration
// paths (CAL1, CAL1A, CAL2, CAL3), each `swl` samples of I, Q.
std::vector<uint8_t> calibration_payload(int swl, double fs, double tp, double rate) {
  std::vector<uint8_t> bytes;
  bytes.reserve(static_cast<std::size_t>(8 * swl));
  const int pulse = static_cast<int>(std::floor(tp * fs));
  for (int path = 0; path < 4; ++path) {
    const double amplitude = 40.0 - 2.0 * path;
    for (int k = 0; k < swl; ++k) {
      std::complex<double> v{};
      if (k < pulse) {
        const double u = k / fs - tp / 2.0;
        v = std::polar(amplitude, kPi * rate * u * u);
      }
      for (double x : {v.real(), v.imag()})
        bytes.push_back(static_cast<uint8_t>(std::clamp(std::floor(x + 128.0), 0.0, 255.0)));
    }
  }
  return bytes;
}

}  // namespace

const char* fault_name(Fault fault) {
  switch (fault) {
    case Fault::kLostPackets: return "lost";
    case Fault::kCorruptHeader: return "corrupt-header";
    case Fault::kWrongModeId: return "mode-id";
    case Fault::kSequenceWrap: return "seq-wrap";
    case Fault::kSwstChange: return "swst-change";
    case Fault::kTruncated: return "truncated";
  }
  return "";
}

Fault fault_from_name(const std::string& name) {
  for (Fault f : {Fault::kLostPackets, Fault::kCorruptHeader, Fault::kWrongModeId, Fault::kSequenceWrap,
                  Fault::kSwstChange, Fault::kTruncated})
    if (name == fault_name(f)) return f;
  throw std::invalid_argument("unknown fault: " + name);
}

ClutterGeometry clutter_geometry(const SimulationConfig& c, const SimulationTruth& truth) {
  if (c.targets.empty()) throw std::invalid_argument("the scene needs at least one target");
  const double t_scene = base::ascii2sec85(c.scene_time);
  const OrbitModel orbit = OrbitModel::for_scene(c.targets.front().position, t_scene, c.im.incidence_deg, c.ascending,
                                                 c.orbit_number);
  ClutterGeometry g;
  g.lines = truth.line_count;
  g.samples = c.samples + std::max(0, truth.swst_change_line >= 0 ? truth.swst_code_after_change - truth.swst_code : 0);
  g.prf = truth.prf;
  g.sampling_frequency = c.im.sampling_frequency;
  g.carrier_frequency = c.im.carrier_frequency;
  g.pulse_length = truth.pulse_length;
  g.chirp_bandwidth = truth.chirp_bandwidth;
  g.near_range_time = truth.near_range_time;
  g.antenna_length = c.im.antenna_length;
  const double mid_offset = truth.first_line_time - t_scene + 0.5 * (truth.line_count - 1) / truth.prf;
  // The beam centre of the attitude as flown, at the middle line.
  const Attitude attitude = truth.attitude;
  if (attitude.yaw_steering || attitude.squint_rad != 0.0) {
    const double t_mid = truth.first_line_time + 0.5 * truth.line_count / truth.prf;
    const double lambda = kSpeedOfLight / c.im.carrier_frequency;
    g.doppler_centroid = [orbit, attitude, t_mid, lambda](double tau) {
      return beam_centre_doppler(orbit, attitude, t_mid, tau, lambda);
    };
  } else {
    g.doppler_centroid = [](double) { return 0.0; };  // steered to zero Doppler
  }
  set_orbit_geometry(g, orbit, mid_offset, c.targets.front().position.height);
  return g;
}

std::vector<double> receive_gain(const ImParameters& im, int count) {
  const double* c = im.gain_c;
  const double a = c[0] * im.gain_t + c[1], b = c[3] * im.gain_t + c[4], d = c[6] * im.gain_t + c[7];
  std::vector<double> g(static_cast<std::size_t>(std::max(0, count)));
  for (int k = 0; k < count; ++k) {
    const double x = k * 1e6 / im.sampling_frequency;
    g[static_cast<std::size_t>(k)] = std::pow(10.0, 0.05 * (a * std::exp(-x / c[2]) + b * std::exp(-x / c[5]) + d));
  }
  return g;
}

SimulationTruth run_simulation(const SimulationConfig& c) {
  if (c.lines < 2 || c.lines > 200000) throw std::invalid_argument("lines must be 2 to 200000");
  if (c.samples < 64 || fbaq_line_bytes(c.samples) > 8192) throw std::invalid_argument("samples must be 64 to 8001");
  if (c.targets.empty()) throw std::invalid_argument("the scene needs at least one target");
  const ImParameters& im = c.im;
  const double t_scene = base::ascii2sec85(c.scene_time);
  if (!(t_scene > 0.0)) throw std::invalid_argument("bad scene time: " + c.scene_time);

  SimulationTruth truth;
  const OrbitModel orbit = OrbitModel::for_scene(c.targets.front().position, t_scene, im.incidence_deg, c.ascending,
                                                 c.orbit_number);
  const double fs = im.sampling_frequency;
  truth.prf = fs / im.pri_code;
  truth.pulse_length = im.pulse_code / fs;
  truth.chirp_bandwidth = im.bandwidth_code * kBandwidthStep;
  truth.wavelength = kSpeedOfLight / im.carrier_frequency;
  const double prf = truth.prf, tp = truth.pulse_length, lambda = truth.wavelength;
  const double rate = truth.chirp_bandwidth / tp;

  // Attitude. A yaw-steered or squinted beam sees the first target away from its zero-Doppler
  // time; the lines are centred on its crossing of the beam centre, and the squint asked for as
  // a centroid is solved together with that time.
  Attitude attitude = c.attitude;
  const bool steered = attitude.yaw_steering || attitude.squint_rad != 0.0 || c.centroid_hz.has_value();
  double t_centre = t_scene;
  if (steered) {
    const Vec3 first_ecef = geodetic_to_ecef(c.targets.front().position);
    // The range window is centred on the first target's echo.
    const double tau_mid = 2.0 * (first_ecef - orbit.state(t_scene).position).norm() / kSpeedOfLight + tp / 2.0;
    for (int pass = 0; pass < 3; ++pass) {
      if (c.centroid_hz) attitude.squint_rad = squint_for_centroid(orbit, attitude, t_centre, tau_mid, lambda, *c.centroid_hz);
      t_centre = beam_centre_time(orbit, attitude, first_ecef, t_centre);
    }
  }

  // Lines: the first target crosses the beam centre at the middle line (at zero Doppler when
  // the beam is steered to zero Doppler).
  const int64_t scene_us = to_mjd_us(t_scene);
  const int64_t first_us = to_mjd_us(t_centre) - std::llround(0.5 * c.lines / prf * 1e6);
  truth.first_line_time = from_mjd_us(first_us);
  const double first_offset = static_cast<double>(first_us - scene_us) * 1e-6;  // from the orbit epoch
  truth.line_count = c.lines;
  const long long first_counter = choose_first_counter(c);
  truth.first_counter = static_cast<int>(first_counter);
  truth.last_counter = static_cast<int>(first_counter + c.lines - 1);
  for (int l = 0; l < c.lines; ++l)
    if (is_calibration_slot(first_counter + l)) truth.calibration_lines.push_back(l);
  truth.echo_lines = c.lines - static_cast<int>(truth.calibration_lines.size());

  // Targets at zero Doppler.
  for (const Target& t : c.targets) {
    TargetTruth tt;
    tt.target = t;
    tt.ecef = geodetic_to_ecef(t.position);
    const double dt = zero_doppler_offset(orbit, tt.ecef, 0.0);
    const StateVector s = orbit.state_at_offset(dt);
    tt.zero_doppler_time = t_scene + dt;
    tt.slant_range = (tt.ecef - s.position).norm();
    tt.range_time = 2.0 * tt.slant_range / kSpeedOfLight;
    tt.azimuth_line = (dt - first_offset) * prf;
    // Doppler rate -2/lambda d2R/dt2, by a central difference around zero Doppler.
    const double h = 0.05;
    auto range_at = [&](double x) { return (tt.ecef - orbit.state_at_offset(x).position).norm(); };
    const double r2 = (range_at(dt + h) - 2.0 * tt.slant_range + range_at(dt - h)) / (h * h);
    tt.doppler_rate = -2.0 / lambda * r2;
    const Vec3 los = (s.position - tt.ecef).unit();
    tt.incidence_deg = std::acos(los.dot(tt.ecef.unit())) / kDeg;
    tt.look_deg = std::acos((s.position * -1.0).unit().dot(los * -1.0)) / kDeg;
    truth.targets.push_back(tt);
  }

  // Range window centred on the first target's echo.
  const double centre_near = truth.targets.front().range_time + tp / 2.0 - 0.5 * c.samples / fs;
  truth.swath_rank = static_cast<int>(std::floor((centre_near + im.range_gate_bias) * prf));
  truth.swst_code = static_cast<int>(std::lround((centre_near + im.range_gate_bias - truth.swath_rank / prf) * fs));
  auto near_of = [&](int swst) { return swst / fs + truth.swath_rank / prf - im.range_gate_bias; };
  truth.near_range_time = near_of(truth.swst_code);
  for (TargetTruth& tt : truth.targets) tt.range_sample = (tt.range_time - truth.near_range_time) * fs;

  // Doppler centroid at the scene centre (middle line, middle sample), and of each target at
  // its crossing of the beam centre.
  const double t_mid = truth.first_line_time + 0.5 * c.lines / prf;
  const double tau_mid = truth.near_range_time + 0.5 * c.samples / fs;
  if (c.centroid_hz) attitude.squint_rad = squint_for_centroid(orbit, attitude, t_mid, tau_mid, lambda, *c.centroid_hz);
  truth.attitude = attitude;
  truth.doppler_centroid = steered ? beam_centre_doppler(orbit, attitude, t_mid, tau_mid, lambda) : 0.0;
  for (TargetTruth& tt : truth.targets) {
    tt.beam_centre_time = steered ? beam_centre_time(orbit, attitude, tt.ecef, tt.zero_doppler_time) : tt.zero_doppler_time;
    tt.doppler_centroid = steered ? target_doppler(orbit, tt.beam_centre_time, tt.ecef, lambda) : 0.0;
  }

  // Faults.
  std::vector<char> lost(static_cast<std::size_t>(c.lines), 0);
  if (has_fault(c, Fault::kLostPackets)) {
    for (int l = c.lines / 3; l < std::min(c.lines - 1, c.lines / 3 + 5); ++l) {
      lost[static_cast<std::size_t>(l)] = 1;
      truth.lost_lines.push_back(l);
    }
  }
  if (has_fault(c, Fault::kCorruptHeader)) truth.corrupt_header_line = c.lines / 2;
  if (has_fault(c, Fault::kWrongModeId)) truth.wrong_mode_line = std::min(c.lines - 2, c.lines / 2 + 7);
  if (has_fault(c, Fault::kSwstChange)) {
    truth.swst_change_line = 2 * c.lines / 3;
    truth.swst_code_after_change = truth.swst_code + 24;
  }
  for (int l = 1; l < c.lines; ++l)
    if (((first_counter + l) & 0x3FFF) == 0) truth.sequence_wrap_line = l;

  // Sizes, known before the first packet is written.
  const std::size_t echo_bytes = fbaq_line_bytes(c.samples);
  const std::size_t cal_bytes = static_cast<std::size_t>(8 * im.calibration_swl);
  auto record_bytes = [&](int l) {
    return static_cast<long long>(kPacketHeadBytes +
                                  (is_calibration_slot(first_counter + l) ? cal_bytes : echo_bytes));
  };
  long long ds_size = 0, num_dsr = 0;
  for (int l = 0; l < c.lines; ++l) {
    if (lost[static_cast<std::size_t>(l)]) continue;
    ds_size += record_bytes(l);
    ++num_dsr;
  }
  truth.full_size = static_cast<long long>(kPacketAreaOffset) + ds_size;
  if (has_fault(c, Fault::kTruncated)) {
    const int cut_line = std::max(1, std::min(c.lines - 1, c.lines * 85 / 100));
    long long at = static_cast<long long>(kPacketAreaOffset);
    for (int l = 0; l < cut_line; ++l)
      if (!lost[static_cast<std::size_t>(l)]) at += record_bytes(l);
    truth.truncated_at_byte = at + std::min<long long>(100, record_bytes(cut_line) / 2);
    truth.last_whole_line = cut_line - 1;
    while (truth.last_whole_line >= 0 && lost[static_cast<std::size_t>(truth.last_whole_line)]) --truth.last_whole_line;
  }

  // Names and the orbit file.
  std::filesystem::create_directories(c.out_dir);
  const double last_time = from_mjd_us(first_us + std::llround((c.lines - 1) / prf * 1e6));
  OrbitFileRequest orq;
  orq.start = std::floor((t_scene - c.orbit_margin) / 60.0) * 60.0;
  orq.stop = std::ceil((t_scene + c.orbit_margin) / 60.0) * 60.0;
  truth.orbit_path = write_orbit_file(orbit, orq, c.out_dir);
  truth.orbit_name = std::filesystem::path(truth.orbit_path).filename().string();

  const int abs_orbit = orbit.absolute_orbit(truth.first_line_time);
  const int rel_orbit = (abs_orbit - 1) % 501 + 1;  // 501 orbits in a 35-day repeat cycle
  const int cycle = (abs_orbit - 1) / 501 + 4;
  {
    char buffer[96];
    std::snprintf(buffer, sizeof buffer, "ASA_IM__0CNPDE%s_%08d2%03d_%05d_%05d_0000.N1",
                  compact_time(truth.first_line_time).c_str(),
                  static_cast<int>(std::ceil(last_time - truth.first_line_time)), cycle % 1000, rel_orbit,
                  abs_orbit % 100000);
    truth.product_name = buffer;
  }
  truth.level0_path = c.out_dir + "/" + truth.product_name;
  const AuxValidity validity = aux_validity_around(truth.first_line_time);
  if (!c.ins_template.empty())
    truth.ins_path = write_ins_file(c.ins_template, im, truth.swath_rank, validity, c.out_dir);
  if (!c.xca_template.empty()) truth.xca_path = write_xca_file(c.xca_template, validity, c.out_dir);

  // Headers.
  const double node_time = orbit.ascending_node_before(truth.first_line_time);
  const StateVector node = orbit.state(node_time);
  const LeapSecond leap = leap_second_before(truth.first_line_time);
  MphFields m;
  m.product = truth.product_name;
  m.proc_stage = 'N';
  m.ref_doc = "PO-RS-MDA-GS2009_06_3C";
  m.acquisition_station = "PDHS-E";
  m.proc_center = "PDHS-E";
  m.proc_time = last_time + 360.0;
  m.software_ver = "sarsim/1.0";
  m.sensing_start = truth.first_line_time;
  m.sensing_stop = last_time;
  m.phase = '2';
  m.cycle = cycle;
  m.rel_orbit = rel_orbit;
  m.abs_orbit = abs_orbit;
  m.state_vector_time = node_time;
  m.position[0] = node.position.x, m.position[1] = node.position.y, m.position[2] = node.position.z;
  m.velocity[0] = node.velocity.x, m.velocity[1] = node.velocity.y, m.velocity[2] = node.velocity.z;
  m.vector_source = "FP";
  m.utc_sbt_time = std::floor(truth.first_line_time / 86400.0) * 86400.0;
  m.sat_binary_time = static_cast<long long>(std::fmod(truth.first_line_time * 256.0, 4.0e9));
  m.clock_step_ps = 3906250000LL;
  m.leap_utc = leap.utc;
  m.leap_sign = leap.sign;
  m.tot_size = truth.full_size;
  m.sph_size = static_cast<long long>(kLevel0SphBytes);
  m.num_dsd = 4;
  m.num_data_sets = 1;

  const StateVector s_scene = orbit.state(t_scene);
  const Vec3 p0 = truth.targets.front().ecef;
  const Vec3 ground_velocity = s_scene.velocity * (p0.norm() / s_scene.position.norm());
  const Geodetic start = ecef_to_geodetic(p0 + ground_velocity * (truth.first_line_time - t_scene));
  const Geodetic stop = ecef_to_geodetic(p0 + ground_velocity * (last_time - t_scene));
  const Geometry axes = local_axes(c.targets.front().position);
  double track = std::atan2(s_scene.velocity.dot(axes.east), s_scene.velocity.dot(axes.north)) / kDeg;
  if (track < 0.0) track += 360.0;

  std::ofstream out(truth.level0_path, std::ios::binary | std::ios::trunc);
  if (!out) throw std::runtime_error("cannot write " + truth.level0_path);
  out << build_mph(m)
      << build_sph(c, start, stop, track, static_cast<int>(truth.lost_lines.size()), ds_size, num_dsr, truth.orbit_name);

  // Clutter, made azimuth block by azimuth block as the lines go by.
  std::optional<ClutterEcho> clutter;
  if (c.clutter.enabled()) {
    const ClutterGeometry g = clutter_geometry(c, truth);
    truth.clutter.present = true;
    const double last = truth.near_range_time + (c.samples - 1) / fs;
    truth.clutter.centroid_near = g.doppler_centroid(truth.near_range_time);
    truth.clutter.centroid_mid = g.doppler_centroid(truth.near_range_time + 0.5 * c.samples / fs);
    truth.clutter.centroid_far = g.doppler_centroid(last);
    truth.clutter.ambiguity_mid = static_cast<int>(std::lround(truth.clutter.centroid_mid / prf));
    clutter.emplace(g, random_reflectivity(c.clutter, g, c.seed ^ 0xC1077E4ull));
  }

  // Packets.
  const std::vector<double> gain = receive_gain(im, c.samples);
  const std::vector<uint8_t> cal_payload = calibration_payload(im.calibration_swl, fs, tp, rate);
  const double noise_sigma = c.noise_db < -100.0 ? 0.0 : std::sqrt(std::pow(10.0, c.noise_db / 10.0) / 2.0);
  std::mt19937_64 random(c.seed);
  std::normal_distribution<double> normal(0.0, 1.0);
  std::vector<std::complex<double>> echo(static_cast<std::size_t>(c.samples));
  std::vector<float> iq(2 * static_cast<std::size_t>(c.samples));
  std::vector<uint8_t> payload;
  long long written = static_cast<long long>(kPacketAreaOffset);
  if (c.keep_echoes) truth.echoes.assign(static_cast<std::size_t>(c.lines) * static_cast<std::size_t>(c.samples), {});

  for (int l = 0; l < c.lines; ++l) {
    const long long counter = first_counter + l;
    const bool calibration = is_calibration_slot(counter);
    const int swst = (truth.swst_change_line >= 0 && l >= truth.swst_change_line) ? truth.swst_code_after_change
                                                                                  : truth.swst_code;
    const double dt = first_offset + l / prf;
    const int64_t time_us = first_us + std::llround(l / prf * 1e6);
    payload.clear();
    if (calibration) {
      payload = cal_payload;
    } else {
      std::fill(echo.begin(), echo.end(), std::complex<double>{});
      const StateVector s = orbit.state_at_offset(dt);
      const AntennaFrame beam = antenna_frame_at_offset(orbit, attitude, dt);
      const double near = near_of(swst);
      for (const TargetTruth& tt : truth.targets) {
        const Vec3 d = tt.ecef - s.position;
        const double r = d.norm();
        const double x = im.antenna_length * std::sin(azimuth_off_boresight(beam, tt.ecef)) / lambda;
        if (std::abs(x) > 3.0) continue;
        const double amplitude = tt.target.amplitude * sinc(x) * sinc(x);
        const double delay = 2.0 * r / kSpeedOfLight;
        const double carrier = -4.0 * kPi * r / lambda;
        const long long k0 = std::max(0LL, static_cast<long long>(std::ceil((delay - near) * fs)));
        const long long k1 = std::min<long long>(c.samples - 1, static_cast<long long>(std::floor((delay + tp - near) * fs)));
        for (long long k = k0; k <= k1; ++k) {
          const double u = (near - delay) + static_cast<double>(k) / fs;
          if (u < 0.0 || u >= tp) continue;
          const double v = u - tp / 2.0;
          echo[static_cast<std::size_t>(k)] += std::polar(amplitude, carrier + kPi * rate * v * v);
        }
      }
      if (clutter) {
        const auto field = clutter->line(l);
        const std::size_t shift = static_cast<std::size_t>(swst - truth.swst_code);
        for (std::size_t k = 0; k < echo.size(); ++k) echo[k] += std::complex<double>(field[k + shift]);
      }
      for (std::size_t k = 0; k < echo.size(); ++k) {
        std::complex<double> v = echo[k] * gain[k];
        if (noise_sigma > 0.0) v += std::complex<double>(noise_sigma * normal(random), noise_sigma * normal(random));
        if (c.keep_echoes)
          truth.echoes[static_cast<std::size_t>(l) * static_cast<std::size_t>(c.samples) + k] = std::complex<float>(v);
        auto adc = [](double x) { return static_cast<float>(std::clamp(std::floor(x) + 0.5, -127.5, 127.5)); };
        iq[2 * k] = adc(v.real());
        iq[2 * k + 1] = adc(v.imag());
      }
      fbaq_encode_line(iq, simulator_fbaq_table(), payload);
    }
    if (lost[static_cast<std::size_t>(l)]) continue;

    PacketHead h;
    h.time_us = time_us;
    h.ground_time_us = time_us + 255000;
    h.process_id = 1556;
    h.sequence_count = static_cast<int>(counter & 0x3FFF);
    h.packet_length = static_cast<int>(payload.size()) + kDataFieldHeaderLength;
    h.mode_id = l == truth.wrong_mode_line ? 85 : 84;
    h.onboard_time = static_cast<uint64_t>(time_us) / 1000000u * 65536u + static_cast<uint64_t>(time_us % 1000000) * 65536u / 1000000u;
    h.mode_counter = static_cast<uint32_t>(counter);
    h.beam_code = im.beam_code;
    h.kind = calibration ? PacketKind::kPeriodicCalibration : PacketKind::kEcho;
    h.cycle_position = cycle_position(counter);
    h.pri_code = im.pri_code;
    h.swst_code = swst;
    h.swl_code = calibration ? im.calibration_swl : c.samples;
    h.pulse_code = im.pulse_code;
    h.bandwidth_code = im.bandwidth_code;
    if (l == truth.corrupt_header_line) {
      // A burst of bit errors: counter, identifiers and header length no longer agree.
      h.sequence_count ^= 0x1555;
      h.process_id ^= 0x2A;
      h.mode_id = 0xA5;
      h.data_field_header_length = 0x3D;
    }
    const auto head = encode_packet_head(h);
    std::string record(reinterpret_cast<const char*>(head.data()), head.size());
    record.append(reinterpret_cast<const char*>(payload.data()), payload.size());
    if (truth.truncated_at_byte >= 0 && written + static_cast<long long>(record.size()) > truth.truncated_at_byte) {
      out.write(record.data(), static_cast<std::streamsize>(truth.truncated_at_byte - written));
      break;
    }
    out.write(record.data(), static_cast<std::streamsize>(record.size()));
    written += static_cast<long long>(record.size());
  }
  out.close();
  if (!out) throw std::runtime_error("cannot write " + truth.level0_path);

  truth.truth_path = c.out_dir + "/truth.txt";
  write_truth_file(truth, c, orbit, truth.truth_path);
  return truth;
}

}  // namespace sar::simulator

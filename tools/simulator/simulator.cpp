#include "simulator/simulator.hpp"

#include <algorithm>
#include <array>
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
#include "simulator/ws_clutter.hpp"

namespace sar::simulator {

namespace {

constexpr std::size_t kLevel0SphBytes = 1956;
constexpr std::size_t kPacketAreaOffset = kMphBytes + kLevel0SphBytes;  // 3203
constexpr double kBandwidthStep = 62745.098039215685;  // 16 MHz in 255 steps
constexpr double kDeg = kPi / 180.0;
constexpr int kWsFirstBeam = 15;  // SS1

// Echoes per block (AP, beams 1-7) and per burst (WS, SS1-SS5) when no ASA_INS template is
// given: those of the instrument's characterisation of 2010.
constexpr int kApBlockEchoes[7] = {198, 200, 261, 222, 283, 243, 304};
constexpr int kWsBurstEchoes[5] = {51, 66, 56, 73, 61};

bool has_fault(const SimulationConfig& c, Fault f) {
  return std::find(c.faults.begin(), c.faults.end(), f) != c.faults.end();
}

int64_t to_mjd_us(double sec85) { return std::llround((sec85 - base::kSec85AtMjd2000) * 1e6); }
double from_mjd_us(int64_t us) { return base::kSec85AtMjd2000 + static_cast<double>(us) * 1e-6; }

double sinc(double x) { return std::abs(x) < 1e-12 ? 1.0 : std::sin(kPi * x) / (kPi * x); }

bool is_ws(const SimulationConfig& c) { return c.mode == AcquisitionMode::kWS; }

// Packets of the stream per the mode's timeline, from `first`.
struct TimelineSetup {
  std::array<WsTimingSwath, 5> ws{};  // WS only
  int block_echoes = 0;               // AP only
  double prf = 0.0;                   // IM, AP
};

std::vector<Slot> timeline_of(const SimulationConfig& c, const TimelineSetup& t, long long first) {
  switch (c.mode) {
    case AcquisitionMode::kIM: return im_timeline(first, c.lines, t.prf);
    case AcquisitionMode::kWS: return ws_timeline(first, c.lines, t.ws, c.ws.order);
    default: return ap_timeline(first, c.lines, t.prf, t.block_echoes);
  }
}

// IM: mid-cycle, so that a product of a few hundred lines holds a periodic calibration pulse;
// neither the first nor the last packet is one. AP and WS: the start of the acquisition. An AP
// product does not open on a calibration pulse or behind a skipped PRI.
long long choose_first_counter(const SimulationConfig& c, const TimelineSetup& t) {
  const bool im = c.mode == AcquisitionMode::kIM;
  long long first = c.first_counter >= 0 ? c.first_counter : (im ? kImInitialPackets + 9LL * kImCyclePackets + 700 : 0);
  if (has_fault(c, Fault::kSequenceWrap)) first = 16384 - c.lines / 2;
  if (first < 0) throw std::invalid_argument("negative first packet counter");
  for (int guard = 0; guard < 4; ++guard) {
    if (first + c.lines > (1LL << 24)) throw std::invalid_argument("mode packet counters must stay within 24 bits");
    const std::vector<Slot> ends = [&] {
      std::vector<Slot> v = timeline_of(c, t, first);
      return std::vector<Slot>{v.front(), v.back()};
    }();
    if (im) {
      if (ends[0].kind == PacketKind::kPeriodicCalibration) ++first;
      else if (ends[1].kind == PacketKind::kPeriodicCalibration) --first;
      else return first;
    } else if (is_alternating(c.mode) && ends[0].cycle >= 0 &&
               (ends[0].kind != PacketKind::kEcho || ends[0].after_gap)) {
      ++first;
    } else {
      return first;
    }
  }
  throw std::invalid_argument("no packet counter keeps calibration pulses off the product ends");
}

// Slant range from a satellite at radius `rs` to a point at radius `re` seen at `incidence`.
double slant_range_at_incidence(double rs, double re, double incidence_deg) {
  const double inc = incidence_deg * kDeg;
  const double look = std::asin(re * std::sin(inc) / rs);
  const double gamma = inc - look;  // angle at the Earth's centre
  return std::sqrt(rs * rs + re * re - 2.0 * rs * re * std::cos(gamma));
}

const char* polarization_text(bool tx_v, bool rx_v) {
  if (tx_v) return rx_v ? "V/V" : "V/H";
  return rx_v ? "H/V" : "H/H";
}

// Transmit and receive polarisation (true: V) of the two AP channels, by mode.
std::array<std::array<bool, 2>, 2> ap_polarizations(AcquisitionMode mode) {
  switch (mode) {
    case AcquisitionMode::kAPC: return {{{true, true}, {false, false}}};   // V/V, H/H
    case AcquisitionMode::kAPH: return {{{false, true}, {false, false}}};  // H/V, H/H
    default: return {{{true, true}, {true, false}}};                       // APV: V/V, V/H
  }
}

double scene_incidence(const SimulationConfig& c) {
  return is_ws(c) ? c.ws.swaths.at(static_cast<std::size_t>(c.ws.target_swath)).incidence_deg : c.im.incidence_deg;
}

struct Geometry {
  Vec3 east, north;
};

Geometry local_axes(const Geodetic& g) {
  const double la = g.lat_deg * kDeg, lo = g.lon_deg * kDeg;
  return {{-std::sin(lo), std::cos(lo), 0.0},
          {-std::sin(la) * std::cos(lo), -std::sin(la) * std::sin(lo), std::cos(la)}};
}

// Product type letters of a mode, padded as product names carry them: "IM__", "APC_", "WS__".
std::string type_letters(const SimulationConfig& c) {
  std::string letters = is_alternating(c.mode) && c.ap.generic_name ? "AP" : mode_codes(c.mode).letters;
  while (letters.size() < 4) letters += '_';
  return letters;
}

std::string build_sph(const SimulationConfig& c, const Geodetic& start, const Geodetic& stop, double track_deg,
                      int missing, long long ds_size, long long num_dsr, const std::string& orbit_name,
                      const std::string& polarization) {
  HeaderText h;
  h.quoted("SPH_DESCRIPTOR", "ASA_" + type_letters(c) + "0P SPECIFIC HEADER", 28);
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
  h.quoted("TX_RX_POLAR", polarization, 5);
  h.quoted("SWATH", is_ws(c) ? std::string("WS") : "IS" + std::to_string(c.im.beam_code), 3);
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
    case Fault::kSwappedPolarisation: return "swapped-polarisation";
  }
  return "";
}

Fault fault_from_name(const std::string& name) {
  for (Fault f : {Fault::kLostPackets, Fault::kCorruptHeader, Fault::kWrongModeId, Fault::kSequenceWrap,
                  Fault::kSwstChange, Fault::kTruncated, Fault::kSwappedPolarisation})
    if (name == fault_name(f)) return f;
  throw std::invalid_argument("unknown fault: " + name);
}

Geodetic ws_swath_target(const SimulationConfig& c, int swath, double along_track_s) {
  if (c.targets.empty() || swath < 0 || swath > 4) throw std::invalid_argument("ws_swath_target needs a first target and a sub-swath 0 to 4");
  const double t_scene = base::ascii2sec85(c.scene_time);
  const OrbitModel orbit = OrbitModel::for_scene(c.targets.front().position, t_scene, scene_incidence(c), c.ascending,
                                                 c.orbit_number);
  const Vec3 first = geodetic_to_ecef(c.targets.front().position);
  const double re = first.norm();
  const StateVector st = orbit.state(t_scene + along_track_s);
  const double rs = orbit.state(t_scene).position.norm();
  const double R = slant_range_at_incidence(rs, re, c.ws.swaths[static_cast<std::size_t>(swath)].incidence_deg);
  // In the plane normal to the velocity through the satellite: down and to the first target's side.
  const Vec3 vhat = st.velocity.unit();
  Vec3 down = st.position * -1.0;
  down = (down - vhat * down.dot(vhat)).unit();
  Vec3 side = vhat.cross(down).unit();
  const Vec3 toFirst = first - orbit.state(t_scene).position;
  if (side.dot(toFirst) < 0.0) side = side * -1.0;
  double lo = 0.0, hi = kPi / 2;
  for (int it = 0; it < 200; ++it) {
    const double m = 0.5 * (lo + hi);
    const Vec3 p = st.position + (down * std::cos(m) + side * std::sin(m)) * R;
    if (p.norm() < re) lo = m; else hi = m;
  }
  const double m = 0.5 * (lo + hi);
  return ecef_to_geodetic(st.position + (down * std::cos(m) + side * std::sin(m)) * R);
}

ClutterGeometry clutter_geometry(const SimulationConfig& c, const SimulationTruth& truth) {
  if (c.targets.empty()) throw std::invalid_argument("the scene needs at least one target");
  if (is_ws(c)) throw std::invalid_argument("clutter is simulated in IM and AP only");
  const double t_scene = base::ascii2sec85(c.scene_time);
  const OrbitModel orbit = OrbitModel::for_scene(c.targets.front().position, t_scene, c.im.incidence_deg, c.ascending,
                                                 c.orbit_number);
  ClutterGeometry g;
  g.lines = truth.grid_lines;
  g.samples = c.samples + std::max(0, truth.swst_change_line >= 0 ? truth.swst_code_after_change - truth.swst_code : 0);
  g.prf = truth.prf;
  g.sampling_frequency = c.im.sampling_frequency;
  g.carrier_frequency = c.im.carrier_frequency;
  g.pulse_length = truth.pulse_length;
  g.chirp_bandwidth = truth.chirp_bandwidth;
  g.near_range_time = truth.near_range_time;
  g.antenna_length = c.im.antenna_length;
  const double mid_offset = truth.first_packet_time - t_scene + 0.5 * (truth.grid_lines - 1) / truth.prf;
  // The beam centre of the attitude as flown, at the middle line.
  const Attitude attitude = truth.attitude;
  if (attitude.yaw_steering || attitude.squint_rad != 0.0) {
    const double t_mid = truth.first_packet_time + 0.5 * truth.grid_lines / truth.prf;
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

namespace {

// What the packets of one channel are made with.
struct ChannelSetup {
  ChannelTruth truth;
  bool tx_v = false, rx_v = false;
  double tp = 0.0, rate = 0.0;  // pulse length, chirp rate
  std::vector<uint8_t> calibration;  // payload of its calibration pulses
  // WS: the sub-swath's two-way elevation pattern, when ASA_XCA and ASA_INS templates are given.
  std::optional<ElevationPattern> elevation;
};

// The wide swath clutter of the product's echo packets (indexed by packet), its level set in the
// reference sub-swath.
WsClutter make_ws_clutter(const SimulationConfig& c, const OrbitModel& orbit, const Attitude& attitude,
                          const std::vector<ChannelSetup>& channels, SimulationTruth& truth, double first_offset,
                          double span, const std::vector<Slot>& slots, std::vector<std::size_t>& line_of_packet) {
  std::array<WsClutterSwath, 5> swaths{};
  for (std::size_t k = 0; k < swaths.size(); ++k) {
    const ChannelTruth& t = channels.at(k).truth;
    swaths[k] = {t.prf, t.near_range_time, channels[k].tp, t.bandwidth_code * kBandwidthStep};
  }
  std::vector<WsEchoLine> lines;
  line_of_packet.assign(static_cast<std::size_t>(c.lines), 0);
  for (int l = 0; l < c.lines; ++l) {
    const Slot& s = slots[static_cast<std::size_t>(l)];
    if (s.kind != PacketKind::kEcho) continue;
    line_of_packet[static_cast<std::size_t>(l)] = lines.size();
    lines.push_back({s.channel, s.time - slots.front().time});
  }
  truth.clutter.present = true;
  return WsClutter(c, orbit, attitude, swaths, truth.reference_channel, first_offset, span, lines);
}

}  // namespace

SimulationTruth run_simulation(const SimulationConfig& c) {
  if (c.lines < 2 || c.lines > 500000) throw std::invalid_argument("lines must be 2 to 500000");
  if (c.samples < 64 || fbaq_line_bytes(c.samples) > 8192) throw std::invalid_argument("samples must be 64 to 8001");
  if (c.targets.empty()) throw std::invalid_argument("the scene needs at least one target");
  if (is_ws(c) && c.clutter.enabled() && has_fault(c, Fault::kSwstChange))
    throw std::invalid_argument("wide swath clutter is simulated with fixed sampling windows only");
  if (is_ws(c) && (c.ws.target_swath < 0 || c.ws.target_swath > 4)) throw std::invalid_argument("target sub-swath must be 0 to 4");
  const ImParameters& im = c.im;
  const double t_scene = base::ascii2sec85(c.scene_time);
  if (!(t_scene > 0.0)) throw std::invalid_argument("bad scene time: " + c.scene_time);

  SimulationTruth truth;
  truth.mode = c.mode;
  const ModeCodes& codes = mode_codes(c.mode);
  const OrbitModel orbit = OrbitModel::for_scene(c.targets.front().position, t_scene, scene_incidence(c), c.ascending,
                                                 c.orbit_number);
  const double fs = im.sampling_frequency;
  const double lambda = kSpeedOfLight / im.carrier_frequency;
  truth.wavelength = lambda;

  // Channels: codes and timing; the range windows follow once the geometry is known.
  std::vector<ChannelSetup> channels(static_cast<std::size_t>(codes.channels));
  for (std::size_t k = 0; k < channels.size(); ++k) {
    ChannelSetup& ch = channels[k];
    ChannelTruth& t = ch.truth;
    t.samples = c.samples;
    t.pulse_code = im.pulse_code;
    t.bandwidth_code = im.bandwidth_code;
    if (is_ws(c)) {
      const WsSwathParameters& w = c.ws.swaths[k];
      t.beam_code = kWsFirstBeam + static_cast<int>(k);
      t.pri_code = w.pri_code;
      t.burst_echoes = w.burst_echoes;
      // A product written with flat patterns must carry flat echoes too, or the engine would
      // be judged against a pattern it is told is not there.
      if (!c.ws.flat_elevation && !c.xca_template.empty() && !c.ins_template.empty())
        ch.elevation = read_elevation_pattern(c.xca_template, c.ins_template, kWsPatternSlot[k], c.ws.vertical ? 1 : 0);
      if (t.burst_echoes <= 0)
        t.burst_echoes = c.ins_template.empty() ? kWsBurstEchoes[k]
                                                : read_ins_swath_row(c.ins_template, InsTable::kWs, t.beam_code).echoes;
      ch.tx_v = ch.rx_v = c.ws.vertical;
    } else {
      t.beam_code = im.beam_code;
      t.pri_code = im.pri_code;
      if (is_alternating(c.mode)) {
        if (im.beam_code < 1 || im.beam_code > 7) throw std::invalid_argument("AP beam code must be 1 to 7");
        t.burst_echoes = c.ap.block_echoes;
        if (t.burst_echoes <= 0)
          t.burst_echoes = c.ins_template.empty() ? kApBlockEchoes[im.beam_code - 1]
                                                  : read_ins_swath_row(c.ins_template, InsTable::kAp, im.beam_code).echoes;
        const auto pols = ap_polarizations(c.mode);
        ch.tx_v = pols[k][0];
        ch.rx_v = pols[k][1];
        if (ch.tx_v != ch.rx_v) t.target_gain = c.ap.cross_polar_gain;
      }
    }
    if (t.pri_code <= 0) throw std::invalid_argument("PRI code must be positive");
    t.polarization = polarization_text(ch.tx_v, ch.rx_v);
    t.prf = fs / t.pri_code;
    ch.tp = t.pulse_code / fs;
    ch.rate = t.bandwidth_code * kBandwidthStep / ch.tp;
  }
  const std::size_t ref = is_ws(c) ? static_cast<std::size_t>(c.ws.target_swath) : 0;
  truth.reference_channel = static_cast<int>(ref);
  truth.prf = channels[ref].truth.prf;
  truth.pulse_length = channels[ref].tp;
  truth.chirp_bandwidth = channels[ref].truth.bandwidth_code * kBandwidthStep;
  const double prf = truth.prf, tp = truth.pulse_length;

  // The timeline. WS ranks come from the geometry; its packet counts do not depend on them
  // beyond B = R + M - 1, so the ranks are found first.
  TimelineSetup timing;
  timing.prf = prf;
  timing.block_echoes = channels[0].truth.burst_echoes;

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

  // Targets at zero Doppler (their lines follow once the timeline is known).
  std::vector<double> zero_doppler_offsets;  // from the orbit epoch
  for (const Target& t : c.targets) {
    TargetTruth tt;
    tt.target = t;
    tt.ecef = geodetic_to_ecef(t.position);
    const double dt = zero_doppler_offset(orbit, tt.ecef, 0.0);
    zero_doppler_offsets.push_back(dt);
    const StateVector s = orbit.state_at_offset(dt);
    tt.zero_doppler_time = t_scene + dt;
    tt.slant_range = (tt.ecef - s.position).norm();
    tt.range_time = 2.0 * tt.slant_range / kSpeedOfLight;
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

  // Range windows: the reference channel's is centred on the first target's echo, the other
  // sub-swaths' on the echo of their own incidence.
  const double rs = orbit.state(t_centre).position.norm();
  const double re = truth.targets.front().ecef.norm();
  for (std::size_t k = 0; k < channels.size(); ++k) {
    ChannelTruth& t = channels[k].truth;
    const double echo_time = is_ws(c) && k != ref
                                 ? 2.0 * slant_range_at_incidence(rs, re, c.ws.swaths[k].incidence_deg) / kSpeedOfLight
                                 : truth.targets.front().range_time;
    const double centre_near = echo_time + channels[k].tp / 2.0 - 0.5 * c.samples / fs;
    t.swath_rank = static_cast<int>(std::floor((centre_near + im.range_gate_bias) * t.prf));
    t.swst_code = static_cast<int>(std::lround((centre_near + im.range_gate_bias - t.swath_rank / t.prf) * fs));
    t.near_range_time = t.swst_code / fs + t.swath_rank / t.prf - im.range_gate_bias;
    if (is_ws(c)) {
      if (t.swath_rank < 2) throw std::invalid_argument("sub-swath rank below 2");
      timing.ws[k] = {t.prf, t.swath_rank, t.burst_echoes};
    }
  }
  truth.swath_rank = channels[ref].truth.swath_rank;
  truth.swst_code = channels[ref].truth.swst_code;
  truth.near_range_time = channels[ref].truth.near_range_time;
  for (TargetTruth& tt : truth.targets) tt.range_sample = (tt.range_time - truth.near_range_time) * fs;

  const long long first_counter = choose_first_counter(c, timing);
  const std::vector<Slot> slots = timeline_of(c, timing, first_counter);
  truth.first_counter = static_cast<int>(first_counter);
  truth.last_counter = static_cast<int>(first_counter + c.lines - 1);
  truth.line_count = c.lines;
  // Seconds of each packet from the first. IM and AP run on one PRF grid.
  const bool on_grid = !is_ws(c);
  auto offset_of = [&](const Slot& s) {
    return on_grid ? static_cast<double>(s.grid - slots.front().grid) / prf : s.time - slots.front().time;
  };
  std::size_t first_echo = 0;  // slot of the first line
  if (is_ws(c)) {
    const int cycle = ws_cycle_packets(timing.ws);
    truth.cycle_packets = cycle;
    long long start = kWsInitialPackets;
    if (first_counter > start) start += (first_counter - start + cycle - 1) / cycle * cycle;
    truth.first_cycle_counter = static_cast<int>(start);
    truth.whole_cycles = static_cast<int>(std::max<long long>(0, (first_counter + c.lines - start) / cycle));
    // The first echo of the first whole cycle; without one, the first echo at all.
    while (first_echo < slots.size() && (slots[first_echo].counter < start || slots[first_echo].kind != PacketKind::kEcho))
      ++first_echo;
    if (first_echo == slots.size()) first_echo = 0;
  }
  while (first_echo < slots.size() && slots[first_echo].kind != PacketKind::kEcho) ++first_echo;
  if (first_echo == slots.size()) throw std::invalid_argument("the product holds no echo");
  std::size_t last_echo = slots.size() - 1;
  while (slots[last_echo].kind != PacketKind::kEcho) --last_echo;
  truth.grid_lines = on_grid ? static_cast<int>(slots.back().grid - slots.front().grid + 1) : 0;
  truth.channel_lines = on_grid ? static_cast<int>(slots[last_echo].grid - slots[first_echo].grid + 1) : 0;

  // Lines: the first target crosses the beam centre in the middle of the product (at zero
  // Doppler when the beam is steered to zero Doppler).
  const int64_t scene_us = to_mjd_us(t_scene);
  const double span = on_grid ? truth.grid_lines / prf : offset_of(slots.back()) + 1.0 / channels[static_cast<std::size_t>(slots.back().channel)].truth.prf;
  const int64_t first_us = to_mjd_us(t_centre) - (on_grid ? std::llround(0.5 * truth.grid_lines / prf * 1e6) : std::llround(0.5 * span * 1e6));
  auto stamp_us = [&](const Slot& s) { return first_us + std::llround(offset_of(s) * 1e6); };
  truth.first_packet_time = from_mjd_us(first_us);
  truth.first_line_time = from_mjd_us(stamp_us(slots[first_echo]));
  const double first_offset = static_cast<double>(first_us - scene_us) * 1e-6;  // from the orbit epoch
  const double line_offset = first_offset + offset_of(slots[first_echo]);
  for (std::size_t i = 0; i < truth.targets.size(); ++i)
    truth.targets[i].azimuth_line = (zero_doppler_offsets[i] - line_offset) * prf;

  // Packets as the truth lists them.
  truth.packets.resize(slots.size());
  for (std::size_t l = 0; l < slots.size(); ++l) {
    const Slot& s = slots[l];
    PacketTruth& p = truth.packets[l];
    p.counter = static_cast<int>(s.counter);
    p.kind = s.kind;
    p.channel = s.channel;
    p.time = from_mjd_us(stamp_us(s));
    p.cycle = s.cycle;
    p.burst_start = s.burst_start;
    p.grid_line = on_grid ? s.grid - slots[first_echo].grid : 0;
    p.calibration_row = s.calibration_row;
    ChannelTruth& t = channels[static_cast<std::size_t>(s.channel)].truth;
    if (s.kind == PacketKind::kEcho) ++t.echo_packets;
    else if (s.kind == PacketKind::kNoise) ++t.noise_packets;
    else ++t.calibration_packets;
    if (s.kind == PacketKind::kPeriodicCalibration) truth.calibration_lines.push_back(static_cast<int>(l));
    if (s.kind == PacketKind::kEcho) ++truth.echo_lines;
  }

  // Doppler centroid at the scene centre (middle line, middle sample), and of each target at
  // its crossing of the beam centre.
  const double t_mid = truth.first_packet_time + (on_grid ? 0.5 * truth.grid_lines / prf : 0.5 * span);
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
      truth.packets[static_cast<std::size_t>(l)].lost = true;
    }
  }
  for (const int l : c.lost_packets) {
    if (l < 0 || l >= c.lines || lost[static_cast<std::size_t>(l)]) continue;
    lost[static_cast<std::size_t>(l)] = 1;
    truth.lost_lines.push_back(l);
    truth.packets[static_cast<std::size_t>(l)].lost = true;
  }
  std::sort(truth.lost_lines.begin(), truth.lost_lines.end());
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
  const std::size_t noise_bytes = noise_line_bytes(c.samples);
  const std::size_t cal_bytes = static_cast<std::size_t>(8 * im.calibration_swl);
  auto record_bytes = [&](int l) {
    const PacketKind kind = slots[static_cast<std::size_t>(l)].kind;
    const std::size_t payload = kind == PacketKind::kEcho ? echo_bytes : kind == PacketKind::kNoise ? noise_bytes : cal_bytes;
    return static_cast<long long>(kPacketHeadBytes + payload);
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
  const double last_time = from_mjd_us(stamp_us(slots.back()));
  OrbitFileRequest orq;
  orq.start = std::floor((t_scene - c.orbit_margin) / 60.0) * 60.0;
  orq.stop = std::ceil((t_scene + c.orbit_margin) / 60.0) * 60.0;
  truth.orbit_path = write_orbit_file(orbit, orq, c.out_dir);
  truth.orbit_name = std::filesystem::path(truth.orbit_path).filename().string();

  const int abs_orbit = orbit.absolute_orbit(truth.first_packet_time);
  const int rel_orbit = (abs_orbit - 1) % 501 + 1;  // 501 orbits in a 35-day repeat cycle
  const int cycle = (abs_orbit - 1) / 501 + 4;
  {
    char buffer[96];
    std::snprintf(buffer, sizeof buffer, "ASA_%s0CNPDE%s_%08d2%03d_%05d_%05d_0000.N1", type_letters(c).c_str(),
                  compact_time(truth.first_packet_time).c_str(),
                  static_cast<int>(std::ceil(last_time - truth.first_packet_time)), cycle % 1000, rel_orbit,
                  abs_orbit % 100000);
    truth.product_name = buffer;
  }
  truth.level0_path = c.out_dir + "/" + truth.product_name;
  const AuxValidity validity = aux_validity_around(truth.first_packet_time);
  if (!c.ins_template.empty()) {
    std::vector<InsSwathRow> rows;
    if (c.mode == AcquisitionMode::kIM) {
      rows.push_back({InsTable::kIm, im.beam_code, -1, truth.swath_rank});
    } else if (is_ws(c)) {
      for (const ChannelSetup& ch : channels)
        rows.push_back({InsTable::kWs, ch.truth.beam_code, ch.truth.burst_echoes, ch.truth.swath_rank});
    } else {
      rows.push_back({InsTable::kAp, im.beam_code, channels[0].truth.burst_echoes, truth.swath_rank});
    }
    truth.ins_path = write_ins_file(c.ins_template, im, rows, validity, c.out_dir);
  }
  if (!c.xca_template.empty()) truth.xca_path = write_xca_file(c.xca_template, validity, c.out_dir);
  if (is_ws(c) && c.ws.flat_elevation && !truth.xca_path.empty()) flatten_elevation_patterns(truth.xca_path);

  // Headers.
  const double node_time = orbit.ascending_node_before(truth.first_packet_time);
  const StateVector node = orbit.state(node_time);
  const LeapSecond leap = leap_second_before(truth.first_packet_time);
  MphFields m;
  m.product = truth.product_name;
  m.proc_stage = 'N';
  m.ref_doc = "PO-RS-MDA-GS2009_06_3C";
  m.acquisition_station = "PDHS-E";
  m.proc_center = "PDHS-E";
  m.proc_time = last_time + 360.0;
  m.software_ver = "sarsim/1.0";
  m.sensing_start = truth.first_packet_time;
  m.sensing_stop = last_time;
  m.phase = '2';
  m.cycle = cycle;
  m.rel_orbit = rel_orbit;
  m.abs_orbit = abs_orbit;
  m.state_vector_time = node_time;
  m.position[0] = node.position.x, m.position[1] = node.position.y, m.position[2] = node.position.z;
  m.velocity[0] = node.velocity.x, m.velocity[1] = node.velocity.y, m.velocity[2] = node.velocity.z;
  m.vector_source = "FP";
  m.utc_sbt_time = std::floor(truth.first_packet_time / 86400.0) * 86400.0;
  m.sat_binary_time = static_cast<long long>(std::fmod(truth.first_packet_time * 256.0, 4.0e9));
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
  const Geodetic start = ecef_to_geodetic(p0 + ground_velocity * (truth.first_packet_time - t_scene));
  const Geodetic stop = ecef_to_geodetic(p0 + ground_velocity * (last_time - t_scene));
  const Geometry axes = local_axes(c.targets.front().position);
  double track = std::atan2(s_scene.velocity.dot(axes.east), s_scene.velocity.dot(axes.north)) / kDeg;
  if (track < 0.0) track += 360.0;

  std::ofstream out(truth.level0_path, std::ios::binary | std::ios::trunc);
  if (!out) throw std::runtime_error("cannot write " + truth.level0_path);
  out << build_mph(m)
      << build_sph(c, start, stop, track, static_cast<int>(truth.lost_lines.size()), ds_size, num_dsr, truth.orbit_name,
                   channels[0].truth.polarization);

  // Clutter, made azimuth block by azimuth block as the lines go by.
  std::optional<ClutterEcho> clutter;
  if (c.clutter.enabled() && !is_ws(c)) {
    const ClutterGeometry g = clutter_geometry(c, truth);
    truth.clutter.present = true;
    const double last = truth.near_range_time + (c.samples - 1) / fs;
    truth.clutter.centroid_near = g.doppler_centroid(truth.near_range_time);
    truth.clutter.centroid_mid = g.doppler_centroid(truth.near_range_time + 0.5 * c.samples / fs);
    truth.clutter.centroid_far = g.doppler_centroid(last);
    truth.clutter.ambiguity_mid = static_cast<int>(std::lround(truth.clutter.centroid_mid / prf));
    clutter.emplace(g, random_reflectivity(c.clutter, g, c.seed ^ 0xC1077E4ull));
  }

  std::optional<WsClutter> ws_clutter;
  std::vector<std::size_t> ws_clutter_line;
  if (is_ws(c) && c.clutter.enabled())
    ws_clutter.emplace(make_ws_clutter(c, orbit, attitude, channels, truth, first_offset, span, slots, ws_clutter_line));

  // Packets.
  const std::vector<double> gain = receive_gain(im, c.samples);
  for (ChannelSetup& ch : channels) ch.calibration = calibration_payload(im.calibration_swl, fs, ch.tp, ch.rate);
  const double noise_sigma = c.noise_db < -100.0 ? 0.0 : std::sqrt(std::pow(10.0, c.noise_db / 10.0) / 2.0);
  std::mt19937_64 random(c.seed);
  std::normal_distribution<double> normal(0.0, 1.0);
  std::vector<std::complex<double>> echo(static_cast<std::size_t>(c.samples));
  std::vector<float> iq(2 * static_cast<std::size_t>(c.samples));
  std::vector<double> noise_iq(2 * static_cast<std::size_t>(c.samples));
  std::vector<uint8_t> payload;
  long long written = static_cast<long long>(kPacketAreaOffset);
  if (c.keep_echoes) truth.echoes.assign(static_cast<std::size_t>(c.lines) * static_cast<std::size_t>(c.samples), {});

  for (int l = 0; l < c.lines; ++l) {
    const Slot& slot = slots[static_cast<std::size_t>(l)];
    const long long counter = slot.counter;
    const ChannelSetup& ch = channels[static_cast<std::size_t>(slot.channel)];
    const ChannelTruth& cht = ch.truth;
    const int swst = (truth.swst_change_line >= 0 && l >= truth.swst_change_line) ? cht.swst_code + 24 : cht.swst_code;
    const double offset = offset_of(slot);
    const double dt = first_offset + offset;
    const int64_t time_us = first_us + std::llround(offset * 1e6);
    payload.clear();
    if (slot.kind == PacketKind::kPeriodicCalibration || slot.kind == PacketKind::kInitialCalibration) {
      payload = ch.calibration;
    } else if (slot.kind == PacketKind::kNoise) {
      // The receiver's noise alone, in 4-bit samples.
      for (double& v : noise_iq) v = noise_sigma > 0.0 ? noise_sigma * normal(random) : 0.0;
      truth.packets[static_cast<std::size_t>(l)].noise_power = noise_encode_line(noise_iq, payload);
    } else {
      std::fill(echo.begin(), echo.end(), std::complex<double>{});
      const StateVector s = orbit.state_at_offset(dt);
      const AntennaFrame beam = antenna_frame_at_offset(orbit, attitude, dt);
      const double near = swst / fs + cht.swath_rank / cht.prf - im.range_gate_bias;
      for (const TargetTruth& tt : truth.targets) {
        const Vec3 d = tt.ecef - s.position;
        const double r = d.norm();
        const double x = im.antenna_length * std::sin(azimuth_off_boresight(beam, tt.ecef)) / lambda;
        if (std::abs(x) > 3.0) continue;
        const double polar = is_alternating(c.mode) ? tt.target.channel_gain[static_cast<std::size_t>(slot.channel & 1)] : 1.0;
        double amplitude = tt.target.amplitude * sinc(x) * sinc(x) * cht.target_gain * polar;
        if (ch.elevation) {
          // Look angle at the satellite against the geocentric vertical.
          const double look = std::acos(std::clamp(s.position.unit().dot((d * -1.0).unit()), -1.0, 1.0)) / kDeg;
          amplitude *= ch.elevation->amplitude(look);
        }
        const double delay = 2.0 * r / kSpeedOfLight;
        const double carrier = -4.0 * kPi * r / lambda;
        const long long k0 = std::max(0LL, static_cast<long long>(std::ceil((delay - near) * fs)));
        const long long k1 = std::min<long long>(c.samples - 1, static_cast<long long>(std::floor((delay + ch.tp - near) * fs)));
        for (long long k = k0; k <= k1; ++k) {
          const double u = (near - delay) + static_cast<double>(k) / fs;
          if (u < 0.0 || u >= ch.tp) continue;
          const double v = u - ch.tp / 2.0;
          echo[static_cast<std::size_t>(k)] += std::polar(amplitude, carrier + kPi * ch.rate * v * v);
        }
      }
      if (ws_clutter) {
        const auto field = ws_clutter->line(ws_clutter_line[static_cast<std::size_t>(l)]);
        for (std::size_t k = 0; k < echo.size(); ++k) echo[k] += std::complex<double>(field[k]);
      }
      if (clutter) {
        const auto field = clutter->line(static_cast<int>(slot.grid - slots.front().grid));
        const std::size_t shift = static_cast<std::size_t>(swst - cht.swst_code);
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
    h.process_id = codes.process_id;
    h.sequence_count = static_cast<int>(counter & 0x3FFF);
    h.packet_length = static_cast<int>(payload.size()) + kDataFieldHeaderLength;
    h.mode_id = l == truth.wrong_mode_line ? codes.mode_id + 1 : codes.mode_id;
    h.onboard_time = static_cast<uint64_t>(time_us) / 1000000u * 65536u + static_cast<uint64_t>(time_us % 1000000) * 65536u / 1000000u;
    h.mode_counter = static_cast<uint32_t>(counter);
    h.beam_code = cht.beam_code;
    h.kind = slot.kind;
    if (slot.kind == PacketKind::kNoise) h.compression = 0;  // 4-bit samples, no blocks
    h.cycle_position = slot.position;
    h.pri_code = cht.pri_code;
    h.swst_code = swst;
    h.swl_code = slot.kind == PacketKind::kEcho || slot.kind == PacketKind::kNoise ? c.samples : im.calibration_swl;
    h.pulse_code = cht.pulse_code;
    h.bandwidth_code = cht.bandwidth_code;
    h.tx_vertical = ch.tx_v;
    h.rx_vertical = ch.rx_v;
    if (is_alternating(c.mode) && slot.kind == PacketKind::kEcho && has_fault(c, Fault::kSwappedPolarisation)) {
      const ChannelSetup& o = channels[static_cast<std::size_t>(1 - (slot.channel & 1))];
      h.tx_vertical = o.tx_v;
      h.rx_vertical = o.rx_v;
    }
    h.calibration_row = slot.calibration_row;
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

  for (ChannelSetup& ch : channels) truth.channels.push_back(ch.truth);
  truth.truth_path = c.out_dir + "/truth.txt";
  write_truth_file(truth, c, orbit, truth.truth_path);
  return truth;
}

}  // namespace sar::simulator

#pragma once
// The test-product simulator: from a scene of point targets it writes an ENVISAT ASAR level 0
// product of image mode (IM), alternating polarisation (APC, APH, APV) or wide swath (WS), a
// DOR_VOR orbit file and a truth file, so that every later stage can be checked against known
// geometry.
//
// Packets follow the instrument's timeline of the mode (timeline.hpp): echoes, noise packets,
// periodic calibration pulses and, in a product that starts with the acquisition, the initial
// noise and calibration packets. In AP the two channels share the swath and codes of `im`; in
// WS each sub-swath has its own PRF, rank, burst length and range window.
//
// Signal model. The packet of line l is stamped with the transmit time t_l = t_first + l / PRF of
// the pulse whose echoes it holds (stop and go: the satellite is taken at S(t_l) for the whole
// echo). A target at slant range R(t_l) returns the transmitted up-chirp
//   exp(j pi K (u - Tp/2)^2), 0 <= u < Tp, u = tau - 2 R / c, K = B / Tp
// times exp(-j 4 pi R / lambda), times the two-way azimuth pattern of a uniform antenna of
// length L, sinc^2(L sin(theta) / lambda), with theta the target's azimuth angle off the beam
// centre of the attitude (attitude.hpp): by default the antenna is steered to zero Doppler and
// sin(theta) is the cosine of the angle between the line of sight and the Earth-fixed velocity;
// with yaw steering or a squint the beam centre is that of the attitude. Sample k
// of a line lies at the two-way time
//   tau_k = SWST / fs + rank / PRF - range_gate_bias + k / fs.
// The sum over targets, plus the echo of distributed clutter when asked for (clutter.hpp), is
// multiplied by the receive gain g(k) that the decoder divides by, white
// Gaussian noise is added, the result is quantised to 8 bits (levels at half-integers, -127.5 to
// 127.5) and packed 8:4 with the simulator's FBAQ table. In AP the lines lie on the PRF grid
// with the skipped PRIs of the change-overs; in WS the packets take the times of the burst
// timeline, each sub-swath at its own PRF, and PRF, rank and window are those of the packet's
// sub-swath. Noise packets hold the same white noise alone, in the 4-bit samples of noise
// packets (fbaq_encoder.hpp); calibration packets the replica through the four paths.
#include <array>
#include <complex>
#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "simulator/attitude.hpp"
#include "simulator/clutter.hpp"
#include "simulator/orbit_model.hpp"
#include "simulator/timeline.hpp"

namespace sar::simulator {

struct Target {
  Geodetic position;
  double amplitude = 30.0;  // echo amplitude at beam centre, ADC counts
  // AP: the target's reflectivity in channel 0 and channel 1 of the mode, on top of the
  // channel's own gain (0 makes a target that one polarisation does not see).
  std::array<double, 2> channel_gain = {1.0, 1.0};
};

enum class Fault {
  kLostPackets,    // five packets missing from the stream a third of the way in
  kCorruptHeader,  // the head of the packet at the middle scores as lost synchronisation
  kWrongModeId,    // one packet with a wrong mode identifier (a tolerated head error)
  kSequenceWrap,   // the 14-bit source sequence count wraps at the middle of the product
  kSwstChange,     // the sampling window start moves by 24 samples two thirds of the way in
  kTruncated,      // the file ends inside a packet at about 85 % of the stream
  kSwappedPolarisation,  // AP: every echo carries the polarisation bits of the other channel
};

/// Fault name as the command line spells it: "lost", "corrupt-header", "mode-id", "seq-wrap",
/// "swst-change", "truncated", "swapped-polarisation". `fault_from_name` throws std::invalid_argument for other names.
const char* fault_name(Fault fault);
Fault fault_from_name(const std::string& name);

/// Nominal image mode acquisition parameters (swath IS2 by default).
struct ImParameters {
  int beam_code = 2;
  double sampling_frequency = 19207680.0;  // Hz
  double carrier_frequency = 5.331004416e9;  // Hz
  int pri_code = 11624;                    // PRF = fs / PRI code, 1652.4 Hz
  int pulse_code = 521;                    // pulse length = code / fs, 27.1 us
  int bandwidth_code = 255;                // bandwidth = code x 16 MHz / 255
  double range_gate_bias = 5.099499844618549e-07;  // s
  double antenna_length = 10.0;            // m
  double incidence_deg = 23.0;             // at the scene centre
  int calibration_swl = 640;               // samples of a periodic calibration packet
  // Receive gain model g(k) = 10^(0.05 (a exp(-x/c2) + b exp(-x/c5) + d)), x = k / fs in us,
  // a = c0 T + c1, b = c3 T + c4, d = c6 T + c7.
  double gain_t = 5.0;
  double gain_c[8] = {-0.004739, 0.403, 25.0, -0.004232, 0.4697, 175.0, 0.0006683, -0.06206};
};

/// Alternating polarisation: two channels on the swath of `im`, their blocks interleaved.
struct ApParameters {
  int block_echoes = 0;           // L; 0: the value of the ASA_INS template for the beam
  double cross_polar_gain = 0.5;  // target amplitude in a cross-polarised channel (H/V, V/H)
  // Name and SPH as real archive products carry them: "ASA_AP__0P" and mode letters "AP_",
  // the sub-mode told only by the packets' mode identifier and polarisation bits.
  bool generic_name = false;
};

/// One wide swath sub-swath.
struct WsSwathParameters {
  int pri_code = 0;
  double incidence_deg = 0.0;  // at the centre of the range window
  int burst_echoes = 0;        // M; 0: the value of the ASA_INS template for the beam
};

/// Wide swath: the five sub-swaths SS1-SS5 (beam codes 15-19), fired in bursts.
struct WsParameters {
  // PRFs 1686, 2058, 1656, 2064 and 1670 Hz; incidences at the middle of each sub-swath. With
  // the nominal orbit they give the ranks of the instrument's tables (9, 12, 10, 13, 11) and
  // sampling windows that open within 5000 samples of their pulse, as the extraction expects.
  std::array<WsSwathParameters, 5> swaths = {{
      {11392, 21.0, 0}, {9335, 28.5, 0}, {11600, 33.6, 0}, {9305, 37.8, 0}, {11500, 41.0, 0}}};
  std::array<int, 5> order = {0, 1, 2, 3, 4};  // firing order
  int target_swath = 2;    // its window is centred on the first target's echo
  bool vertical = false;   // V/V instead of H/H
  // The written ASA_XCA's elevation patterns flat (0 dB), so that a job correcting the elevation
  // pattern leaves the echoes' range level as the simulator made it (the clutter carries no
  // elevation pattern).
  bool flat_elevation = false;
};

struct SimulationConfig {
  AcquisitionMode mode = AcquisitionMode::kIM;
  std::string out_dir = ".";
  // Packets of the stream, from the first to the last. IM: from the first echo, unless
  // first_counter puts the start in the initial calibration.
  int lines = 512;
  int samples = 1024;  // complex samples of an echo line (SWL code)
  std::vector<Target> targets;
  double noise_db = 20.0;  // noise power of a complex sample, dB relative to 1 count^2; below -100: none
  std::vector<Fault> faults;
  // Packets (indices of the stream, from 0) left out of the product on top of the faults.
  std::vector<int> lost_packets;
  std::string scene_time = "02-MAR-2008 10:00:00.000000";  // zero-Doppler time of the first target
  bool ascending = false;
  int orbit_number = 31400;  // absolute orbit at the scene time
  // Mode packet counter of the first packet; -1: chosen (IM: mid-cycle; AP and WS: 0, the start
  // of the acquisition with its initial noise and calibration packets).
  int first_counter = -1;
  uint64_t seed = 1;
  ImParameters im;  // IM and AP: the swath and codes; all modes: frequencies, gate bias, gain
  ApParameters ap;
  WsParameters ws;
  double orbit_margin = 7200.0;  // s of orbit file before and after the scene
  // Real ASA_INS and ASA_XCA products whose patched copies are written beside the level 0
  // product (see aux_files.hpp); empty: that product is not written.
  std::string ins_template;
  std::string xca_template;
  bool keep_echoes = false;  // keep every line's echo before quantisation in the truth
  // Antenna attitude (attitude.hpp). By default the beam is steered ideally to zero Doppler;
  // with yaw steering or a squint the lines are centred on the first target's beam-centre
  // crossing instead of its zero-Doppler time.
  Attitude attitude{.yaw_steering = false};
  // When set, the squint is chosen so that the beam-centre Doppler centroid at the scene centre
  // (middle line, middle sample) is this many Hz; attitude.squint_rad is then ignored.
  std::optional<double> centroid_hz;
  // Distributed clutter added to the echoes of the targets (see clutter.hpp); off by default.
  // WS: uniform clutter in every sub-swath (ws_clutter.hpp), its power that of a raw sample at
  // the middle of the target sub-swath.
  ClutterOptions clutter;
};

/// One channel of the product: the polarisation of AP, the sub-swath of WS.
struct ChannelTruth {
  int beam_code = 0;
  std::string polarization;  // "H/H", "V/V", "H/V", "V/H"
  int pri_code = 0;
  double prf = 0.0;
  int pulse_code = 0;
  int bandwidth_code = 0;
  int swath_rank = 0;
  int swst_code = 0;
  int samples = 0;           // SWL of echoes and noise packets
  double near_range_time = 0.0;  // two-way time of sample 0 at swst_code
  int burst_echoes = 0;      // WS: M; AP: L (the same for both channels)
  double target_gain = 1.0;  // factor on the target amplitudes
  int echo_packets = 0, noise_packets = 0, calibration_packets = 0;  // in the stream, lost ones too
};

/// One packet of the stream (lost ones included).
struct PacketTruth {
  int counter = 0;
  PacketKind kind = PacketKind::kEcho;
  int channel = 0;
  double time = 0.0;          // sec85, the head's stamp
  bool lost = false;
  long long cycle = -1;       // timeline cycle from 0; -1 in the initial packets
  bool burst_start = false;   // WS: first echo of a burst
  long long grid_line = 0;    // IM, AP: line of the regular PRF grid, 0 at the first echo
  double noise_power = 0.0;   // noise packets: mean I^2 + Q^2 of the decoded levels
  int calibration_row = 0;    // calibration packets: the antenna row of the pulse
};

/// What one target looks like in the product.
struct TargetTruth {
  Target target;
  Vec3 ecef;
  double zero_doppler_time = 0.0;  // sec85
  double slant_range = 0.0;        // m, at zero Doppler
  double range_time = 0.0;         // two-way, s: the echo's leading edge
  double azimuth_line = 0.0;       // (zero Doppler time - first line time) x PRF
  double range_sample = 0.0;       // (range time - near range time) x fs, first SWST
  double doppler_rate = 0.0;       // Hz/s at zero Doppler
  double incidence_deg = 0.0;
  double look_deg = 0.0;
  double beam_centre_time = 0.0;  // sec85 of the crossing of the beam centre
  double doppler_centroid = 0.0;  // Hz, absolute: the target's Doppler at that crossing
};

/// The clutter of a product: absolute beam-centre centroid at the middle line for the first,
/// middle (samples / 2) and last sample of the window, and its ambiguity (whole PRFs) there.
struct ClutterTruth {
  bool present = false;
  double centroid_near = 0.0, centroid_mid = 0.0, centroid_far = 0.0;  // Hz
  int ambiguity_mid = 0;
};

struct SimulationTruth {
  AcquisitionMode mode = AcquisitionMode::kIM;
  std::string level0_path, orbit_path, truth_path, product_name, orbit_name;
  std::string ins_path, xca_path;  // empty when not written
  // sec85, stamp of the first echo: the first packet in IM (unless the product starts in the
  // initial calibration); AP: the first line of the line grid; WS: the first echo of the first
  // whole cycle.
  double first_line_time = 0.0;
  double first_packet_time = 0.0;  // sec85
  int line_count = 0;            // packets from the first to the last, lost ones included
  int echo_lines = 0;
  std::vector<int> calibration_lines;  // line indices of periodic calibration packets
  // Channels (one in IM); the fields below (prf, swath_rank, swst_code, near_range_time) are
  // those of the reference channel: 0, or in WS the sub-swath centred on the first target.
  std::vector<ChannelTruth> channels;
  int reference_channel = 0;
  std::vector<PacketTruth> packets;
  // IM, AP: PRIs spanned by the stream; and lines per channel of the regular PRF grid from the
  // first echo to the last (AP: every packet takes a line, and each skipped PRI of a
  // change-over one more).
  int grid_lines = 0;
  int channel_lines = 0;
  // WS: packets of a cycle, counter of the first whole cycle's first packet, whole cycles.
  int cycle_packets = 0;
  int first_cycle_counter = 0;
  int whole_cycles = 0;
  double prf = 0.0;
  double pulse_length = 0.0;
  double chirp_bandwidth = 0.0;
  double wavelength = 0.0;
  int swath_rank = 0;
  int swst_code = 0;
  double near_range_time = 0.0;
  int first_counter = 0;
  int last_counter = 0;
  std::vector<TargetTruth> targets;
  // Faults; -1 when not injected.
  std::vector<int> lost_lines;
  int corrupt_header_line = -1;
  int wrong_mode_line = -1;
  int sequence_wrap_line = -1;  // first line whose sequence count is 0 again
  int swst_change_line = -1;
  int swst_code_after_change = 0;
  long long truncated_at_byte = -1;
  int last_whole_line = -1;  // last line whose record is complete in a truncated file
  long long full_size = 0;   // TOT_SIZE of the MPH
  // With keep_echoes: line_count x samples values, packet by packet, of the signal the ADC sees
  // (targets times the receive gain, plus noise), before the 8-bit and the FBAQ quantisation.
  // Lines of calibration pulses and noise packets are zero.
  std::vector<std::complex<float>> echoes;
  ClutterTruth clutter;
  Attitude attitude;              // as flown, with the squint that was chosen
  double doppler_centroid = 0.0;  // Hz, absolute beam-centre centroid at the scene centre
};

/// Runs the simulation and writes the three files into `config.out_dir`. Throws
/// std::runtime_error or std::invalid_argument on bad input or a failed write.
SimulationTruth run_simulation(const SimulationConfig& config);

/// The clutter geometry of a simulation whose truth holds the acquisition (prf, pulse, range
/// window): the orbit of the scene at the middle line, the window of `samples` plus the largest
/// SWST shift of the product, lines on the PRF grid from the first packet. Tests use it to feed
/// their own reflectivity. IM and AP only.
ClutterGeometry clutter_geometry(const SimulationConfig& config, const SimulationTruth& truth);

/// A wide swath target for sub-swath `swath` of a configuration whose first target is set: on
/// the first target's sphere, at the middle of that sub-swath's range window, seen at zero
/// Doppler `along_track_s` seconds after the scene time.
Geodetic ws_swath_target(const SimulationConfig& config, int swath, double along_track_s);

/// Receive gain g(k) of the model in `im`, for k in [0, count).
std::vector<double> receive_gain(const ImParameters& im, int count);

}  // namespace sar::simulator

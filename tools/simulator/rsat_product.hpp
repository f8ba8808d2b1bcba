#pragma once
// RADARSAT-1 CEOS raw products for the tests: the leader `lea_01.001` and the data file
// `dat_01.001`, written from a scene of point targets, and the pieces they are made of (the
// auxiliary header's bit fields, 4-bit samples, leader records) for tests that need a broken
// product.
//
// Leader: a file descriptor, the data set summary, two filler records (map projection and
// attitude-like, as real leaders hold them ahead of and behind the orbit), the platform position
// record with inertial state vectors (km, m/s) and the Greenwich hour angle of the first, and a
// radiometric filler. Data file: a 16444-byte descriptor, then one record a line of a 192-byte
// header, the 50-byte auxiliary header, a replica (on every k-th line), the 4-bit echo and fill;
// records with a replica are longer, the descriptor gives the longest.
//
// Signal model, as in the ENVISAT simulator: stop and go, the line of pulse l transmitted at
// t_l = t_first + l / PRF; a target at slant range R returns the up-chirp
// exp(j pi K (u - Tp/2)^2), 0 <= u < Tp, u = tau - 2R/c, times exp(-j 4 pi R / lambda) and
// the two-way pattern sinc^2(L sin(theta) / lambda) of a 15 m antenna. RADARSAT-1 is not yaw
// steered: the beam centre is perpendicular to the inertial velocity, so Earth rotation puts
// the centroid several PRFs away from zero and a target's echoes seconds from its zero-Doppler
// time. Sample k of a line lies at tau_k = (W + 5) T - 4.2 us + N / PRF + k dt. Noise is white
// Gaussian; the line is divided by the attenuation's gain and quantised to the 4-bit levels
// (v + 0.5, v = -8..7).
#include <array>
#include <cstdint>
#include <string>
#include <vector>

#include "simulator/clutter.hpp"
#include "simulator/orbit_model.hpp"
#include "simulator/simulator.hpp"

namespace sar::simulator::rsat {

/// Auxiliary header fields; encode_aux packs them at their bit positions.
struct AuxFields {
  int bandwidth_code = 0;
  int beam_code = 16;
  int adc_code = 0;
  int pri_count = 4283;
  int swst_count = 0;
  int rx_duration = 0;
  int seconds = 0;       // of the day, 17 bits
  int milliseconds = 0;  // 10 bits
  int fraction = 0;      // 1/1024 ms, 10 bits
  int attenuation = 0;   // dB, 6 bits
};
std::array<uint8_t, 50> encode_aux(const AuxFields& fields);

/// The 4-bit code of a sample value: level floor(x) clamped to -8..7, two's complement nibble.
uint8_t encode_nibble(float x);

/// One record of the data file.
struct DataRecord {
  int64_t line_index = 1;
  AuxFields aux;
  std::vector<uint8_t> replica;  // empty: none
  std::vector<uint8_t> echo;     // 2 bytes a sample, I then Q
  int fill = 8;                  // zero bytes behind the samples
  int64_t length_override = -1;  // written as the record length when not negative
};
struct DataFileOptions {
  int64_t announced_records = -1;  // descriptor's count; -1: the records given
  int64_t record_length = -1;      // descriptor's longest record; -1: the longest written
};
void write_data_file(const std::string& path, const std::vector<DataRecord>& records, const DataFileOptions& options = {});

struct LeaderContent {
  std::string scene_id = "R1SIMULATED00001";
  std::string orbit_configuration = "DESCENDING";
  std::string mission = "R1";
  std::string sensor = "RSAT-1-C -    -HH";
  std::string orbit_number = "00012345";
  std::string product_type = "RSAT-1-SAR-RAW";
  int year = 2000, month = 1, day = 1, day_of_year = 1;
  double seconds_of_day = 0.0;
  double interval = 30.0;
  std::string frame = "GEOCENTRIC EQUATORIAL INERTIAL";
  double gha_deg = 0.0;
  std::vector<Vec3> positions;   // written as given (km for an inertial leader)
  std::vector<Vec3> velocities;  // m/s
};
void write_leader(const std::string& path, const LeaderContent& content);

/// Leader vectors of the orbit: `count` inertial vectors (km, m/s) `interval` s apart from
/// `first` (sec85), turned with the hour angle `gha_deg` at the first, with the date fields.
LeaderContent leader_from_orbit(const OrbitModel& orbit, double first, int count, double interval, double gha_deg);

/// Beam set-ups of the simulator: "F1" (ADC 0, 32.32 MHz, 30 MHz) and "S3" (ADC 1, 18.47 MHz,
/// 17.28 MHz), both at a PRF near 1257 Hz with 8 pulses in flight.
struct BeamSetup {
  std::string name;
  int beam_code = 0, adc_code = 0, bandwidth_code = 0, pri_count = 0, pulses_in_flight = 0;
  double time_unit = 0.0, sampling_period = 0.0, bandwidth = 0.0, incidence_deg = 0.0;
  int replica_bytes = 0;
};
BeamSetup beam_setup(const std::string& name);  // throws std::invalid_argument

struct RsatConfig {
  std::string out_dir = ".";
  std::string beam = "F1";
  int lines = 2048;
  int samples = 1024;  // multiple of 8
  std::vector<Target> targets;
  double noise_db = 3.0;      // power of a complex sample before quantisation, dB re 1
  std::string scene_time = "10-OCT-2001 14:30:00.000000";  // beam-centre crossing of the first target
  bool ascending = false;
  uint64_t seed = 7;
  int replica_every = 64;     // a replica on every k-th line, from line 0
  double replica_amplitude = 5.0;
  // Faults; -1 where not injected.
  int gap_line = -1, gap_length = 0;             // records of lines [gap_line, gap_line + gap_length) missing
  int swst_change_line = -1, swst_change_counts = 0;  // W grows by the counts from that line
  int attenuation_step_line = -1, attenuation_step_db = 0;  // attenuation grows from that line
  int attenuation_db = 10;    // attenuation of the first line
  int repeated_index_line = -1;  // this record carries the index of the one before
  // Distributed clutter (homogeneous or textured, see clutter.hpp) with the beam's centroid;
  // its window is that of the first line (an SWST change does not move it).
  ClutterOptions clutter;
  int vectors = 21;
  double vector_interval = 30.0;
};

struct RsatTargetTruth {
  Target target;
  Vec3 ecef;
  double zero_doppler_time = 0.0, slant_range = 0.0, range_time = 0.0;
  double azimuth_line = 0.0, range_sample = 0.0;  // on the raw grid: line 0, W of line 0
  double beam_centre_time = 0.0, doppler_centroid = 0.0, doppler_rate = 0.0;
  double beam_centre_range_time = 0.0;  // two-way time of the leading edge at the crossing
};

struct RsatTruth {
  std::string leader_path, data_path, truth_path;
  BeamSetup beam;
  double prf = 0.0, first_line_time = 0.0, near_range_time = 0.0, sampling_frequency = 0.0;
  int swst_count = 0, rx_duration = 0, lines = 0, samples = 0;
  double doppler_centroid = 0.0;  // at the scene centre, Hz
  double clutter_centroid_mid = 0.0;  // beam-centre centroid of the clutter at mid range, Hz (0 without)
  std::vector<RsatTargetTruth> targets;
};

/// Write lea_01.001, dat_01.001 and truth.txt into `out_dir`.
RsatTruth simulate_rsat(const RsatConfig& config);

}  // namespace sar::simulator::rsat

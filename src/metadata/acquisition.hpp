#pragma once
// The acquisition record of one channel of a raw scene. Every sensor reader fills it and every
// processor reads it, so it belongs to neither.
//
// `sarpar` holds one channel: the swath in wide swath mode, the polarisation in alternating
// polarisation, the only channel in image mode and for RADARSAT. Several fields that the stages
// named first are kept under their established names:
//   samplingRate = sampling frequency, nearRangeTime = near range time,
//   azimuthStartTime = first line time, lines = line count, samples = line samples.
#include <array>
#include <cstdint>
#include <string>

#include "metadata/scene_references.hpp"

namespace sar::metadata {

/// Room for the burst numbers of SWST changes in wide swath mode.
inline constexpr int kMaxSwstChanges = 51;

/// Per-channel acquisition parameters. Times: range times are two-way seconds, azimuth times sec85.
struct sarpar {
  std::string outputDir;   // directory of the run's intermediate files
  std::string extrPath;    // base path of the extracted raw lines ("<dir>/EXTR")
  std::string slcPath;     // focused product
  std::string rgfPath;     // range-focused lines ("<dir>/EXTR.rgf")
  std::string reportPath;  // "<dir>/report.bin"
  std::string raw_file;    // this channel's line file; empty: extrPath (single-channel modes)
  std::string noise_file;  // noise lines, written when noise is extracted

  double samplingRate = 0.0;      // Hz, range sampling frequency
  double carrierFrequency = 0.0;  // Hz
  double prf = 0.0;               // Hz, sampling frequency / PRI code
  double nearRangeTime = 0.0;     // s, two-way time of the first sample of the nearest window
  double far_range_time = 0.0;    // s, the same for the farthest window
  double pulse_length = 0.0;      // s
  int32_t chirp_band_code = 0;
  double chirp_bandwidth = 0.0;   // Hz, code x 16 MHz / 255
  double azimuthStartTime = 0.0;  // sec85, sensing time of the first output line
  double range_gate_bias = 0.0;   // s
  double antenna_length = 0.0;    // m
  int32_t swst_code = 0;          // before extraction the most frequent SWST, after it the smallest met
  int32_t swst_max_code = 0;      // largest SWST met
  int32_t swath_rank = 0;         // pulses in flight
  int32_t burst_echoes = 0;       // echoes per burst or block
  int32_t resampling_factor = 1;
  int32_t lines = 0;              // output lines, the same for all channels
  int32_t swl_code = 0;           // most frequent sampling window length code
  int32_t polarization_type = 0;  // 0 H/H, 1 V/V, 2 H/V, 3 V/H
  int32_t swath_number = 0;       // beam code before extraction; swath digit (IM) or channel + 1 (WS) after
  int32_t samples = 0;            // complex samples per line
  int32_t swl_noise_code = 0;     // most frequent SWL of noise packets (WS)
  int32_t ss_order = 0;           // position of this swath in the firing sequence (WS)
  int32_t burst_count = 0;        // extraction length in table units (bursts per swath in WS)
  int32_t noise_packets = 0;      // noise packets seen
  double scene_centre_latitude = 0.0;  // degrees
  double ascending_node_time = 0.0;    // sec85
  double mean_noise_power = 0.0;       // mean of the noise lines' mean power
  double cycle_time = 0.0;             // s, duration of one timeline cycle
  int32_t swst_change_count = 0;
  std::array<int32_t, kMaxSwstChanges> swst_change_burst{};  // burst number of each change (WS)
};

/// The nominal linear FM replica of a channel into `refs`: N = round(fs * tau / resampling)
/// samples, centred (zero phase in the middle), every part scaled by B / N. Returns 0, or 10
/// when the pulse has no length.
int synthetic_chirp(const sarpar& par, SceneReferences& refs);

}  // namespace sar::metadata

#pragma once
// The truth file of a simulated product, in profile syntax (sections in brackets, "key = value"
// lines; the lines before the first section are a comment). Times are written twice: as time
// text "dd-MMM-yyyy hh:mm:ss.uuuuuu" and as sec85 with nine decimals. Lists are "{a b c}", an
// empty list "{}". Keys:
//
// [product]     level0_file, orbit_file, product_name, orbit_name, ins_file, xca_file (the
//               matching ASA_INS and ASA_XCA, empty when not written), mode (IM, APC, APH, APV,
//               WS), swath (IS2, or WS), polarization (H/H; channel 1's in AP), full_size (bytes
//               the MPH announces)
// [acquisition] first_line_time, first_line_time_sec85 (stamp of the first echo: in IM the
//               first packet, unless it lies in the initial calibration; in WS the first echo
//               of the first whole cycle),
//               line_count (packets from the first to the last, lost ones included),
//               echo_lines, calibration_lines (line indices of periodic calibration pulses),
//               first_counter, last_counter (mode packet counters), prf, pri_code, swst_code,
//               swl_code, line_samples, sampling_frequency, carrier_frequency, wavelength,
//               pulse_code, pulse_length, bandwidth_code, chirp_bandwidth, range_gate_bias,
//               swath_rank, beam_code, near_range_time (two-way time of sample 0 for swst_code),
//               antenna_length, noise_db, doppler_centroid (Hz, absolute beam-centre centroid
//               at the middle line and sample; 0 when the beam is steered to zero Doppler),
//               yaw_steering (0 or 1), squint (rad, positive forward),
//               range_resolution (c / 2B, m, slant), azimuth_resolution (L / 2, m),
//               echo_convention (where the echo of a target lies in the line); in AP and WS
//               the values of the reference channel (reference_channel, from 0: channel 1 in
//               AP, the sub-swath centred on the first target in WS) and also
//               first_packet_time, first_packet_time_sec85, channels; AP: grid_lines (PRIs
//               spanned by the stream), channel_lines (lines per channel of the PRF grid from
//               the first to the last echo); WS: cycle_packets, first_cycle_counter,
//               whole_cycles, firing_order (sub-swath numbers 1-5)
// [channel_N]   AP and WS, N from 1 (a polarisation or a sub-swath): polarization, beam_code,
//               pri_code, prf, swath_rank, swst_code, near_range_time, swl_code, block_echoes
//               (AP) or burst_echoes (WS), target_gain, echo_packets, noise_packets,
//               calibration_packets (in the stream); WS: burst_times_sec85 (stamp of the first
//               echo of each burst of the whole cycles)
// [orbit]       epoch, epoch_sec85, semi_major_axis, inclination, period, ascending (0 or 1),
//               absolute_orbit, ascending_node_time, ascending_node_time_sec85
// [target_N]    (N from 1) latitude, longitude, height, amplitude, x, y, z (Earth-fixed),
//               zero_doppler_time, zero_doppler_time_sec85, slant_range, range_time (two-way
//               time of the echo's leading edge), azimuth_line (fractional line of zero Doppler),
//               range_sample (fractional sample of the leading edge at swst_code),
//               doppler_rate (Hz/s), incidence, look (degrees), doppler_centroid (Hz,
//               absolute: the target's Doppler as it crosses the beam centre),
//               beam_centre_time, beam_centre_time_sec85 (that crossing)
// [faults]      faults (names), lost_lines, corrupt_header_line, wrong_mode_line,
//               sequence_wrap_line, swst_change_line, swst_code_after_change,
//               truncated_at_byte, last_whole_line (-1 where the fault was not injected)
// [clutter]     only with clutter: power_db (mean power of a raw sample before the receive gain,
//               dB re 1 count^2), contrast (low or high), doppler_centroid_near,
//               doppler_centroid_mid, doppler_centroid_far (absolute beam-centre centroid, Hz, at
//               the first, middle and last sample of the window), ambiguity_mid (whole PRFs in
//               the centroid at mid range, rounded half away from zero)
#include <string>

#include "simulator/simulator.hpp"

namespace sar::simulator {

void write_truth_file(const SimulationTruth& truth, const SimulationConfig& config, const OrbitModel& orbit,
                      const std::string& path);

}  // namespace sar::simulator

#pragma once
// The instrument's packet timelines as the simulator plays them: for each value of the mode
// packet counter, what ASAR sends (echo, noise, periodic or initial calibration), for which
// channel, and when. A product is a run of consecutive counters from any first counter on.
//
// Image mode (IM): the acquisition opens with 105 packets, 8 noise and 97 initial calibration,
// then runs cycles of 1024 lines: 1023 echoes and one periodic calibration pulse.
//
// Alternating polarisation (AP): 16 noise packets (8 of channel 0, then 8 of channel 1), 194
// initial calibration packets (97 a channel), then cycles of 8 L - 2 packets, L the echoes of a
// block, in eight blocks that alternate between the channels:
//   channel 0: L - 1 echoes and a calibration pulse     channel 1: L - 1 echoes
//   channel 0: L - 1 echoes                             channel 1: L echoes
//   channel 0: L echoes                                 channel 1: L - 1 echoes and a pulse
//   channel 0: L echoes                                 channel 1: L echoes
// At the two change-overs that open blocks 3 and 4 the transmission sequence skips one PRI: no
// packet is sent for it, so a cycle spans 8 L PRIs. Every packet, the calibration pulses
// included, takes one PRI.
//
// Wide swath (WS): 525 packets, a group of 105 (8 noise, 97 initial calibration) for each
// sub-swath in firing order, then cycles through the five sub-swaths in firing order o[0..4].
// The block of sub-swath s has B = R + M - 1 packets at its own PRF (R its rank, M its echoes
// per burst): R - 2 noise packets, as no echo of the burst has come back yet, M echoes, one
// periodic calibration pulse. A block lasts B + 1 of its PRIs; an initial packet lasts one PRI
// of its group's sub-swath.
#include <array>
#include <cstdint>
#include <string>
#include <vector>

#include "simulator/level0_packet.hpp"

namespace sar::simulator {

enum class AcquisitionMode { kIM, kAPC, kAPH, kAPV, kWS };

/// Codes of a mode: the product's mode letters, the packets' mode and process identifiers.
struct ModeCodes {
  const char* letters;  // "IM", "APC", "APH", "APV", "WS"
  int mode_id;
  int process_id;
  int channels;
};
const ModeCodes& mode_codes(AcquisitionMode mode);
bool is_alternating(AcquisitionMode mode);

/// "im", "apc", "aph", "apv", "ws"; `mode_from_name` throws std::invalid_argument for others.
const char* mode_name(AcquisitionMode mode);
AcquisitionMode mode_from_name(const std::string& name);

inline constexpr int kImInitialPackets = 105;
inline constexpr int kImCyclePackets = 1024;
inline constexpr int kApNoisePackets = 16;
inline constexpr int kApInitialPackets = 210;
inline constexpr int kWsGroupPackets = 105;
inline constexpr int kWsInitialPackets = 525;
inline constexpr int kInitialNoisePackets = 8;
inline constexpr int kCalibrationRows = 32;

/// One packet of the timeline.
struct Slot {
  long long counter = 0;
  PacketKind kind = PacketKind::kEcho;
  int channel = 0;         // AP: polarisation channel; WS: sub-swath 0-4; IM: 0
  int position = 0;        // 12-bit position of the head: in the cycle (IM, AP) or block (WS)
  int calibration_row = 0; // antenna row a calibration packet was sent through
  bool after_gap = false;  // AP: a PRI without a packet precedes this one
  bool burst_start = false;  // WS: first echo of a burst
  long long cycle = -1;    // cycle number from 0; -1 in the initial packets
  long long grid = 0;      // IM, AP: PRIs from counter 0 to this packet
  double time = 0.0;       // s from counter 0
};

/// IM timeline from `first` for `count` counters.
std::vector<Slot> im_timeline(long long first, int count, double prf);

/// AP timeline; `block_echoes` is L (at least 3).
std::vector<Slot> ap_timeline(long long first, int count, double prf, int block_echoes);
/// Position in the AP cycle of a counter at or after the initial packets.
int ap_cycle_position(long long counter, int block_echoes);

/// WS timeline. Per sub-swath (index 0-4) its PRF, rank R (at least 2) and burst echoes M;
/// `order` lists the sub-swaths in firing order.
struct WsTimingSwath {
  double prf = 0.0;
  int rank = 0;
  int burst_echoes = 0;
};
std::vector<Slot> ws_timeline(long long first, int count, const std::array<WsTimingSwath, 5>& swaths,
                              const std::array<int, 5>& order);
/// Packets of a WS cycle: the sum of R + M - 1 over the sub-swaths.
int ws_cycle_packets(const std::array<WsTimingSwath, 5>& swaths);

}  // namespace sar::simulator

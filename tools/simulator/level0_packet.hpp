#pragma once
// One measurement data set record of an ASAR level 0 product: a 68-byte head and the packet
// payload. The head holds, big-endian:
//   0-11  sensing time, MJD2000 (days, seconds, microseconds, 32 bits each)
//   12-31 front-end processor annotation: ground station time (12), ISP length (2), CRC error
//         count (2), Reed-Solomon error count (2), spare (2)
//   32-37 packet primary header: version/type/flag bits and the 11-bit process identifier,
//         sequence flags and the 14-bit source sequence count, packet data length L
//   38-67 data field header: its length (29), mode identifier (41), on-board time (42-47),
//         24-bit mode packet counter (48-50), beam code and compression (51), echo/noise/
//         calibration flags and the 12-bit cycle position (52-53), PRI, SWST, SWL codes
//         (54-59), polarisation bits and calibration row (61), 10-bit pulse length code
//         (62-63), chirp bandwidth code (64)
// The payload is L - 29 bytes, so a record is L + 39 bytes.
#include <array>
#include <cstdint>

namespace sar::simulator {

inline constexpr std::size_t kPacketHeadBytes = 68;
inline constexpr int kDataFieldHeaderLength = 29;

enum class PacketKind { kEcho, kPeriodicCalibration, kNoise, kInitialCalibration };

struct PacketHead {
  int64_t time_us = 0;            // sensing time, microseconds since 1-JAN-2000
  int64_t ground_time_us = 0;     // reception time at the ground station, same scale
  int process_id = 1556;          // 11 bits
  int sequence_count = 0;         // 14 bits
  int packet_length = 0;          // L: payload bytes + 29
  int data_field_header_length = kDataFieldHeaderLength;
  int mode_id = 84;
  uint64_t onboard_time = 0;      // 48 bits
  uint32_t mode_counter = 0;      // 24 bits
  int beam_code = 2;              // 6 bits
  int compression = 1;            // 2 bits; 1 is the 8:4 block quantisation of echoes
  PacketKind kind = PacketKind::kEcho;
  int cycle_position = 0;         // 12 bits
  int pri_code = 0;
  int swst_code = 0;
  int swl_code = 0;
  bool tx_vertical = false;
  bool rx_vertical = false;
  int calibration_row = 0;        // 5 bits
  int pulse_code = 0;             // 10 bits
  int bandwidth_code = 255;
};

/// The 68 head bytes. Sequence count and mode counter are written as given, so a fault can make
/// them disagree.
std::array<uint8_t, kPacketHeadBytes> encode_packet_head(const PacketHead& head);

}  // namespace sar::simulator

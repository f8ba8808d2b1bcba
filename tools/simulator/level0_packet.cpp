#include "simulator/level0_packet.hpp"

namespace sar::simulator {

namespace {

void put16(uint8_t* p, uint32_t v) {
  p[0] = static_cast<uint8_t>(v >> 8);
  p[1] = static_cast<uint8_t>(v);
}

void put32(uint8_t* p, uint32_t v) {
  put16(p, v >> 16);
  put16(p + 2, v & 0xFFFFu);
}

void put_mjd(uint8_t* p, int64_t us) {
  const int64_t day_us = 86400LL * 1000000LL;
  int64_t days = us / day_us;
  if (us % day_us < 0) --days;
  const int64_t in_day = us - days * day_us;
  put32(p, static_cast<uint32_t>(days));
  put32(p + 4, static_cast<uint32_t>(in_day / 1000000));
  put32(p + 8, static_cast<uint32_t>(in_day % 1000000));
}

// Flag bits of byte 52 above the cycle position. Echoes carry bit 4 with the echo bit, as the
// instrument sets it; periodic calibration pulses carry bits 5 and 4.
uint8_t kind_flags(PacketKind kind) {
  switch (kind) {
    case PacketKind::kEcho: return 0x90;
    case PacketKind::kNoise: return 0x40;
    case PacketKind::kPeriodicCalibration: return 0x30;
    case PacketKind::kInitialCalibration: return 0x20;
  }
  return 0;
}

}  // namespace

std::array<uint8_t, kPacketHeadBytes> encode_packet_head(const PacketHead& h) {
  std::array<uint8_t, kPacketHeadBytes> b{};
  uint8_t* p = b.data();
  put_mjd(p, h.time_us);
  put_mjd(p + 12, h.ground_time_us);
  put16(p + 24, static_cast<uint32_t>(h.packet_length));  // ISP length as the FEP counted it
  // 26-31: no CRC or Reed-Solomon errors, spare.
  // Version 4, telemetry, with data field header: 100 0 1 then the process identifier.
  put16(p + 32, 0x8800u | (static_cast<uint32_t>(h.process_id) & 0x7FFu));
  put16(p + 34, 0xC000u | (static_cast<uint32_t>(h.sequence_count) & 0x3FFFu));  // unsegmented
  put16(p + 36, static_cast<uint32_t>(h.packet_length));
  put16(p + 38, static_cast<uint32_t>(h.data_field_header_length));
  p[41] = static_cast<uint8_t>(h.mode_id);
  put16(p + 42, static_cast<uint32_t>(h.onboard_time >> 32) & 0xFFFFu);
  put32(p + 44, static_cast<uint32_t>(h.onboard_time & 0xFFFFFFFFu));
  p[48] = static_cast<uint8_t>(h.mode_counter >> 16);
  p[49] = static_cast<uint8_t>(h.mode_counter >> 8);
  p[50] = static_cast<uint8_t>(h.mode_counter);
  p[51] = static_cast<uint8_t>(((h.beam_code & 0x3F) << 2) | (h.compression & 3));
  p[52] = static_cast<uint8_t>(kind_flags(h.kind) | ((h.cycle_position >> 8) & 0x0F));
  p[53] = static_cast<uint8_t>(h.cycle_position);
  put16(p + 54, static_cast<uint32_t>(h.pri_code));
  put16(p + 56, static_cast<uint32_t>(h.swst_code));
  put16(p + 58, static_cast<uint32_t>(h.swl_code));
  p[61] = static_cast<uint8_t>(0x80 | (h.tx_vertical ? 0x40 : 0) | (h.rx_vertical ? 0x20 : 0) | (h.calibration_row & 0x1F));
  p[62] = static_cast<uint8_t>((h.pulse_code >> 2) & 0xFF);
  p[63] = static_cast<uint8_t>((h.pulse_code & 3) << 6);
  p[64] = static_cast<uint8_t>(h.bandwidth_code);
  return b;
}

}  // namespace sar::simulator

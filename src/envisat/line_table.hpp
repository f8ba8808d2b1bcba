#pragma once
// The expected packets of a level 0 product, built from the instrument's fixed timeline.
//
// Entry i belongs to mode packet counter first_packet_counter + i and says what the instrument
// sent for it: an echo, a calibration pulse or a noise packet, and for which channel. Only the
// first and the last packet and the timeline constants are needed; the packets in between are
// not looked at here.
//
// Timelines:
//  - IM: 105 packets of initial calibration (8 noise, then calibration), then cycles of 1024
//    lines: 1023 echoes and a periodic calibration pulse.
//  - AP: 16 noise packets (8 per channel), 194 of initial calibration (97 per channel), then
//    cycles of 8 L - 2 lines of both polarisations, L the echoes of a block.
//  - WS: 525 packets (105 per swath: 8 noise, 97 calibration), then cycles through the five
//    swaths in firing order; a swath's block has B = R + M - 1 lines: R - 2 noise, M echoes and
//    a periodic calibration pulse.
#include <array>
#include <cstdint>
#include <span>
#include <vector>

namespace sar::envisat {

/// Kind values held in the low two bits of `kind_word`, and the flags added to it.
enum LineKind : std::uint16_t {
  kLineEcho = 0,
  kLinePeriodicCalibration = 1,
  kLineNoise = 2,
  kLineInitialCalibration = 3,
};
inline constexpr std::uint16_t kLineSelected = 4;
inline constexpr std::uint16_t kLineLost = 16;
inline constexpr std::uint16_t kLineCycleStart = 32;
inline constexpr std::uint16_t kLineBurstStart = 64;
/// `channel_word` of an AP padding slot: 666 + the channel.
inline constexpr std::int16_t kPaddingChannel = 666;

struct LineTableEntry {
  std::uint16_t kind_word = 0;
  std::int16_t channel_word = 0;
  int kind() const { return kind_word % 4; }
};

struct LineTable {
  double first_echo_time = 0.0;  // sec85
  double line_interval = 0.0;    // s: 1 / prf (IM, AP); one cycle (WS)
  std::int32_t lines_per_cycle = 0;
  std::int32_t cycle_count = 0;
  std::int32_t first_cycle_index = 0;
  std::int32_t first_echo_counter = 0;
  double first_packet_time = 0.0;  // sec85
  double last_packet_time = 0.0;   // sec85
  std::int32_t first_packet_counter = 0;
  std::int32_t last_packet_counter = 0;
  std::vector<LineTableEntry> entries;

  /// Entry of a mode packet counter, which must lie between the first and the last packet.
  const LineTableEntry& at_counter(std::int32_t counter) const;
};

/// First or last packet of a product, as its head tells.
struct PacketMark {
  std::int32_t counter = 0;  // mode packet counter
  double time = 0.0;         // sensing time, sec85
  bool echo = false;         // echo flag of the head
};

/// Timeline constants of one wide swath sub-swath.
struct WsSwathTimeline {
  double prf = 0.0;            // Hz
  std::int32_t swathRank = 0;  // R
  std::int32_t burstEchoes = 0;  // M
};

inline constexpr std::int32_t kImInitialPackets = 105;
inline constexpr std::int32_t kImCycleLines = 1024;
inline constexpr std::int32_t kApNoisePackets = 16;
inline constexpr std::int32_t kApInitialPackets = 210;
inline constexpr std::int32_t kWsGroupPackets = 105;
inline constexpr std::int32_t kWsInitialPackets = 525;
inline constexpr std::int32_t kInitialNoisePackets = 8;
/// Largest table built: the mode packet counter has 24 bits.
inline constexpr std::int64_t kMaxTableEntries = std::int64_t{1} << 24;

/// IM table. Throws std::invalid_argument for a last packet before the first, a non-positive
/// PRF or a table above kMaxTableEntries.
LineTable build_im_table(const PacketMark& first, const PacketMark& last, double prf);

/// AP table; `blockEchoes` is L, the echoes of a block of channel 0. The cycle lasts 2 L / prf.
LineTable build_ap_table(const PacketMark& first, const PacketMark& last, double prf, std::int32_t blockEchoes);
double ap_cycle_time(double prf, std::int32_t blockEchoes);

/// WS table. `swaths` is indexed by swath (0-4); `order` lists the swaths in firing order.
LineTable build_ws_table(const PacketMark& first, const PacketMark& last, const std::array<WsSwathTimeline, 5>& swaths,
                         const std::array<int, 5>& order);

/// The value with the most occurrences among the non-zero entries, the earliest on a tie;
/// 0 when there is none. At most 128 distinct values are counted, later ones are ignored.
std::int32_t most_frequent_value(std::span<const std::int32_t> values);

}  // namespace sar::envisat

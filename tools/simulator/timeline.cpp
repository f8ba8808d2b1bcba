#include "simulator/timeline.hpp"

#include <stdexcept>

namespace sar::simulator {

namespace {

constexpr std::array<ModeCodes, 5> kModeCodes = {{
    {"IM", 84, 1556, 1},
    {"APC", 103, 1543, 2},
    {"APH", 104, 1544, 2},
    {"APV", 164, 1549, 2},
    {"WS", 91, 1563, 5},
}};
constexpr std::array<const char*, 5> kModeNames = {"im", "apc", "aph", "apv", "ws"};

void check_count(long long first, int count) {
  if (first < 0 || count < 1 || first + count > (1LL << 24))
    throw std::invalid_argument("mode packet counters must stay within 24 bits");
}

// The initial packets of a channel group: the first 8 are noise, the rest calibration pulses
// sent through the antenna rows in turn.
void initial_slot(Slot& s, int in_group) {
  if (in_group < kInitialNoisePackets) {
    s.kind = PacketKind::kNoise;
  } else {
    s.kind = PacketKind::kInitialCalibration;
    s.calibration_row = (in_group - kInitialNoisePackets) % kCalibrationRows;
  }
}

}  // namespace

const ModeCodes& mode_codes(AcquisitionMode mode) { return kModeCodes.at(static_cast<std::size_t>(mode)); }

bool is_alternating(AcquisitionMode mode) {
  return mode == AcquisitionMode::kAPC || mode == AcquisitionMode::kAPH || mode == AcquisitionMode::kAPV;
}

const char* mode_name(AcquisitionMode mode) { return kModeNames.at(static_cast<std::size_t>(mode)); }

AcquisitionMode mode_from_name(const std::string& name) {
  for (std::size_t m = 0; m < kModeNames.size(); ++m)
    if (name == kModeNames[m]) return static_cast<AcquisitionMode>(m);
  throw std::invalid_argument("unknown acquisition mode: " + name);
}

// ---------------------------------------------------------------------------------------------
std::vector<Slot> im_timeline(long long first, int count, double prf) {
  check_count(first, count);
  std::vector<Slot> slots(static_cast<std::size_t>(count));
  for (int l = 0; l < count; ++l) {
    Slot& s = slots[static_cast<std::size_t>(l)];
    s.counter = first + l;
    s.grid = s.counter;
    s.time = static_cast<double>(s.grid) / prf;
    if (s.counter < kImInitialPackets) {
      s.position = static_cast<int>(s.counter);
      initial_slot(s, s.position);
      continue;
    }
    s.cycle = (s.counter - kImInitialPackets) / kImCyclePackets;
    s.position = static_cast<int>((s.counter - kImInitialPackets) % kImCyclePackets);
    // The periodic pulse of image mode keeps row 0.
    s.kind = s.position == kImCyclePackets - 1 ? PacketKind::kPeriodicCalibration : PacketKind::kEcho;
  }
  return slots;
}

// ---------------------------------------------------------------------------------------------
int ap_cycle_position(long long counter, int block_echoes) {
  return static_cast<int>((counter - kApInitialPackets) % (8LL * block_echoes - 2));
}

std::vector<Slot> ap_timeline(long long first, int count, double prf, int block_echoes) {
  check_count(first, count);
  const int l = block_echoes;
  if (l < 3 || 8LL * l - 2 > 4095) throw std::invalid_argument("AP echoes per block must be 3 to 512");
  const long long cycle = 8LL * l - 2;
  std::vector<Slot> slots(static_cast<std::size_t>(count));
  for (int i = 0; i < count; ++i) {
    Slot& s = slots[static_cast<std::size_t>(i)];
    s.counter = first + i;
    if (s.counter < kApNoisePackets) {
      s.kind = PacketKind::kNoise;
      s.channel = static_cast<int>(s.counter / kInitialNoisePackets);
      s.position = static_cast<int>(s.counter);
      s.grid = s.counter;
    } else if (s.counter < kApInitialPackets) {
      const int in_channel = static_cast<int>((s.counter - kApNoisePackets) % 97);
      s.kind = PacketKind::kInitialCalibration;
      s.channel = static_cast<int>((s.counter - kApNoisePackets) / 97);
      s.calibration_row = in_channel % kCalibrationRows;
      s.position = static_cast<int>(s.counter);
      s.grid = s.counter;
    } else {
      const long long k = (s.counter - kApInitialPackets) / cycle;
      const int q = ap_cycle_position(s.counter, l);
      s.cycle = k;
      s.position = q;
      // Blocks: [start, end) of positions, channel, calibration pulse at the end or not.
      struct Block { int start, end, channel; bool pulse; };
      const Block blocks[8] = {
          {0, l, 0, true},               {l, 2 * l - 1, 1, false},
          {2 * l - 1, 3 * l - 2, 0, false}, {3 * l - 2, 4 * l - 2, 1, false},
          {4 * l - 2, 5 * l - 2, 0, false}, {5 * l - 2, 6 * l - 2, 1, true},
          {6 * l - 2, 7 * l - 2, 0, false}, {7 * l - 2, 8 * l - 2, 1, false},
      };
      for (int b = 0; b < 8; ++b) {
        const Block& blk = blocks[b];
        if (q < blk.start || q >= blk.end) continue;
        s.channel = blk.channel;
        const bool pulse = blk.pulse && q == blk.end - 1;
        s.kind = pulse ? PacketKind::kPeriodicCalibration : PacketKind::kEcho;
        if (pulse) s.calibration_row = static_cast<int>((2 * k + (blk.channel == 0 ? 0 : 1)) % kCalibrationRows);
        s.after_gap = (b == 2 || b == 3) && q == blk.start;
        break;
      }
      // The skipped PRIs at the change-overs that open blocks 3 and 4 (indices 2 and 3).
      const long long gaps = (q >= 2 * l - 1 ? 1 : 0) + (q >= 3 * l - 2 ? 1 : 0);
      s.grid = kApInitialPackets + k * 8LL * l + q + gaps;
    }
    s.time = static_cast<double>(s.grid) / prf;
  }
  return slots;
}

// ---------------------------------------------------------------------------------------------
int ws_cycle_packets(const std::array<WsTimingSwath, 5>& swaths) {
  int c = 0;
  for (const WsTimingSwath& w : swaths) c += w.rank + w.burst_echoes - 1;
  return c;
}

std::vector<Slot> ws_timeline(long long first, int count, const std::array<WsTimingSwath, 5>& swaths,
                              const std::array<int, 5>& order) {
  check_count(first, count);
  std::array<bool, 5> seen{};
  for (int s : order) {
    if (s < 0 || s > 4 || seen[static_cast<std::size_t>(s)]) throw std::invalid_argument("WS firing order must name each sub-swath once");
    seen[static_cast<std::size_t>(s)] = true;
  }
  for (const WsTimingSwath& w : swaths)
    if (!(w.prf > 0.0) || w.rank < 2 || w.burst_echoes < 1) throw std::invalid_argument("WS sub-swath timing out of range");

  // Durations: an initial group of 105 packets, and each block of a cycle with its start.
  double initial_time = 0.0;
  for (int g = 0; g < 5; ++g) initial_time += kWsGroupPackets / swaths[static_cast<std::size_t>(order[static_cast<std::size_t>(g)])].prf;
  std::array<int, 5> block_start{};
  std::array<double, 5> block_time{};
  int cycle_packets = 0;
  double cycle_time = 0.0;
  for (std::size_t j = 0; j < 5; ++j) {
    const WsTimingSwath& w = swaths[static_cast<std::size_t>(order[j])];
    block_start[j] = cycle_packets;
    block_time[j] = cycle_time;
    cycle_packets += w.rank + w.burst_echoes - 1;
    cycle_time += (w.rank + w.burst_echoes) / w.prf;
  }

  std::vector<Slot> slots(static_cast<std::size_t>(count));
  for (int i = 0; i < count; ++i) {
    Slot& s = slots[static_cast<std::size_t>(i)];
    s.counter = first + i;
    if (s.counter < kWsInitialPackets) {
      const int g = static_cast<int>(s.counter / kWsGroupPackets);
      s.channel = order[static_cast<std::size_t>(g)];
      s.position = static_cast<int>(s.counter % kWsGroupPackets);
      initial_slot(s, s.position);
      double t = 0.0;
      for (int h = 0; h < g; ++h) t += kWsGroupPackets / swaths[static_cast<std::size_t>(order[static_cast<std::size_t>(h)])].prf;
      s.time = t + s.position / swaths[static_cast<std::size_t>(s.channel)].prf;
      continue;
    }
    const long long k = (s.counter - kWsInitialPackets) / cycle_packets;
    const int x = static_cast<int>((s.counter - kWsInitialPackets) % cycle_packets);
    std::size_t j = 4;
    while (x < block_start[j]) --j;
    const int q = x - block_start[j];
    const WsTimingSwath& w = swaths[static_cast<std::size_t>(order[j])];
    s.cycle = k;
    s.channel = order[j];
    s.position = q;
    if (q < w.rank - 2) {
      s.kind = PacketKind::kNoise;
    } else if (q == w.rank + w.burst_echoes - 2) {
      s.kind = PacketKind::kPeriodicCalibration;
      s.calibration_row = static_cast<int>(k % kCalibrationRows);
    } else {
      s.kind = PacketKind::kEcho;
      s.burst_start = q == w.rank - 2;
    }
    s.time = initial_time + static_cast<double>(k) * cycle_time + block_time[j] + q / w.prf;
  }
  return slots;
}

}  // namespace sar::simulator

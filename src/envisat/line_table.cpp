#include "envisat/line_table.hpp"

#include <cmath>
#include <stdexcept>
#include <string>

namespace sar::envisat {
namespace {

void check_span(const PacketMark& first, const PacketMark& last) {
  if (first.counter < 0 || last.counter < first.counter)
    throw std::invalid_argument("timeline: last packet counter " + std::to_string(last.counter) +
                                " before first " + std::to_string(first.counter));
  if (std::int64_t{last.counter} - first.counter + 1 > kMaxTableEntries)
    throw std::invalid_argument("timeline: too many packets");
}

void check_prf(double prf) {
  if (!(prf > 0.0) || !std::isfinite(prf)) throw std::invalid_argument("timeline: PRF must be positive");
}

LineTable table_frame(const PacketMark& first, const PacketMark& last) {
  LineTable t;
  t.first_packet_counter = first.counter;
  t.last_packet_counter = last.counter;
  t.first_packet_time = first.time;
  t.last_packet_time = last.time;
  t.entries.resize(static_cast<std::size_t>(last.counter - first.counter + 1));
  return t;
}

std::int32_t floor_div(std::int32_t a, std::int32_t b) { return a >= 0 ? a / b : -((-a + b - 1) / b); }

}  // namespace

const LineTableEntry& LineTable::at_counter(std::int32_t counter) const {
  if (counter < first_packet_counter || counter > last_packet_counter)
    throw std::out_of_range("counter " + std::to_string(counter) + " outside the table");
  return entries[static_cast<std::size_t>(counter - first_packet_counter)];
}

// ---------------------------------------------------------------------------------------------
LineTable build_im_table(const PacketMark& first, const PacketMark& last, double prf) {
  check_span(first, last);
  check_prf(prf);
  LineTable t = table_frame(first, last);
  const std::int32_t f = first.counter;
  const std::int32_t e = last.counter;
  const std::int32_t cyclesBefore = f >= kImInitialPackets ? (f - kImInitialPackets) / kImCycleLines + 1 : 0;
  if (f >= kImInitialPackets) {
    // A first packet that is no echo is the cycle's calibration pulse: the echo follows it.
    t.first_echo_counter = first.echo ? f : f + 1;
    t.first_echo_time = first.echo ? first.time : first.time + 1.0 / prf;
  } else {
    t.first_echo_counter = kImInitialPackets;
    t.first_echo_time = first.time + (kImInitialPackets - f) / prf;
  }
  t.first_cycle_index = t.first_echo_counter;
  t.line_interval = 1.0 / prf;
  t.lines_per_cycle = 1;
  const std::int32_t n = floor_div(e - kImInitialPackets, kImCycleLines) + 1;
  t.cycle_count = e - t.first_echo_counter - n + cyclesBefore;

  for (std::int32_t c = f; c <= e; ++c) {
    LineTableEntry& entry = t.entries[static_cast<std::size_t>(c - f)];
    if (c < kImInitialPackets) {
      entry.kind_word = c < kInitialNoisePackets ? kLineNoise : kLineInitialCalibration;
      continue;
    }
    const std::int32_t pos = (c - kImInitialPackets) % kImCycleLines;
    entry.kind_word = pos == kImCycleLines - 1 ? kLinePeriodicCalibration : kLineEcho;
    if (pos == 0) entry.kind_word |= kLineCycleStart;
  }
  return t;
}

// ---------------------------------------------------------------------------------------------
double ap_cycle_time(double prf, std::int32_t blockEchoes) { return 2.0 * blockEchoes / prf; }

namespace {
// Position q of an AP cycle of 8 L - 2 lines: the channel word and the kind.
LineTableEntry ap_slot(std::int32_t q, std::int32_t l) {
  LineTableEntry s;
  auto set = [&](std::int16_t channel, std::uint16_t kind) {
    s.channel_word = channel;
    s.kind_word = kind;
  };
  if (q <= l - 2) set(0, kLineEcho);
  else if (q == l - 1) set(0, kLinePeriodicCalibration);
  else if (q <= 2 * l - 2) set(1, kLineEcho);
  else if (q == 2 * l - 1) set(kPaddingChannel, kLineEcho);
  else if (q <= 3 * l - 3) set(0, kLineEcho);
  else if (q == 3 * l - 2) set(kPaddingChannel + 1, kLineEcho);
  else if (q <= 4 * l - 3) set(1, kLineEcho);
  else if (q <= 5 * l - 3) set(0, kLineEcho);
  else if (q <= 6 * l - 4) set(1, kLineEcho);
  else if (q == 6 * l - 3) set(1, kLinePeriodicCalibration);
  else if (q <= 7 * l - 3) set(0, kLineEcho);
  else set(1, kLineEcho);
  return s;
}
}  // namespace

LineTable build_ap_table(const PacketMark& first, const PacketMark& last, double prf, std::int32_t blockEchoes) {
  check_span(first, last);
  check_prf(prf);
  if (blockEchoes < 3 || blockEchoes > 0x7fff) throw std::invalid_argument("AP timeline: echoes per block out of range");
  LineTable t = table_frame(first, last);
  const std::int32_t f = first.counter;
  const std::int32_t cycle = 8 * blockEchoes - 2;
  if (f < kApInitialPackets) {
    t.first_echo_counter = kApInitialPackets;
    t.first_echo_time = first.time + (kApInitialPackets - f) / prf;
  } else {
    t.first_echo_counter = first.echo ? f : f + 1;
    t.first_echo_time = first.echo ? first.time : first.time + 1.0 / prf;
  }
  t.first_cycle_index = t.first_echo_counter;
  t.line_interval = 1.0 / prf;
  t.lines_per_cycle = 1;
  t.cycle_count = last.counter - t.first_echo_counter + 1;

  bool firstAfterInitial = true;
  for (std::int32_t c = f; c <= last.counter; ++c) {
    LineTableEntry& entry = t.entries[static_cast<std::size_t>(c - f)];
    if (c < kApNoisePackets) {
      entry = {kLineNoise, static_cast<std::int16_t>(c / kInitialNoisePackets)};
    } else if (c < kApInitialPackets) {
      entry = {kLineInitialCalibration, static_cast<std::int16_t>((c - kApNoisePackets) / 97)};
    } else {
      entry = ap_slot((c - kApInitialPackets) % cycle, blockEchoes);
      if (firstAfterInitial) entry.kind_word |= kLineCycleStart;
      firstAfterInitial = false;
    }
  }
  return t;
}

// ---------------------------------------------------------------------------------------------
LineTable build_ws_table(const PacketMark& first, const PacketMark& last, const std::array<WsSwathTimeline, 5>& swaths,
                         const std::array<int, 5>& order) {
  check_span(first, last);
  std::array<std::int32_t, 5> blockLines{};  // B of the block at firing position j
  std::array<double, 5> prf{};
  std::int32_t cycle = 0;
  for (std::size_t j = 0; j < 5; ++j) {
    const int s = order[j];
    if (s < 0 || s > 4) throw std::invalid_argument("WS timeline: firing order names swath " + std::to_string(s));
    const WsSwathTimeline& w = swaths[static_cast<std::size_t>(s)];
    check_prf(w.prf);
    if (w.swathRank < 2 || w.burstEchoes < 1 || w.swathRank + w.burstEchoes > 0x7fff)
      throw std::invalid_argument("WS timeline: rank or burst echoes out of range for swath " + std::to_string(s));
    blockLines[j] = w.swathRank + w.burstEchoes - 1;
    prf[j] = w.prf;
    cycle += blockLines[j];
  }
  // Firing position and position inside the block of a cycle offset x.
  auto locate = [&](std::int32_t x, std::size_t& j, std::int32_t& q) {
    j = 0;
    while (x >= blockLines[j]) x -= blockLines[j++];
    q = x;
  };

  LineTable t = table_frame(first, last);
  t.lines_per_cycle = cycle;
  for (std::size_t j = 0; j < 5; ++j) t.line_interval += (blockLines[j] + 1) / prf[j];

  const std::int32_t f = first.counter;
  if (f >= kWsInitialPackets) {
    const std::int32_t firstCycle = (f - kWsInitialPackets) / cycle + 1;
    const std::int32_t x = (f - kWsInitialPackets) % cycle;
    std::size_t j = 0;
    std::int32_t q = 0;
    locate(x, j, q);
    if (x != 0) {
      // Start at the next whole cycle.
      t.first_cycle_index = firstCycle + 1;
      t.first_echo_counter = f + (blockLines[j] - q);
      t.first_echo_time = first.time + (blockLines[j] - q + 1) / prf[j];
      for (std::size_t k = j + 1; k < 5; ++k) {
        t.first_echo_counter += blockLines[k];
        t.first_echo_time += (blockLines[k] + 1) / prf[k];
      }
    } else {
      t.first_cycle_index = firstCycle;
      t.first_echo_counter = f;
      t.first_echo_time = first.time + 8.0 / prf[0];
    }
  } else {
    t.first_cycle_index = 1;
    t.first_echo_counter = kWsInitialPackets;
    t.first_echo_time = first.time;
    for (std::int32_t c = f; c < kWsInitialPackets; ++c)
      t.first_echo_time += 1.0 / prf[static_cast<std::size_t>(c / kWsGroupPackets)];
  }
  const std::int32_t e = last.counter;
  if (e >= kWsInitialPackets) {
    const std::int32_t lastCycle = (e - kWsInitialPackets) / cycle + 1;
    const bool endsWithCycle = (e - kWsInitialPackets) % cycle == cycle - 1;
    t.cycle_count = lastCycle - t.first_cycle_index + (endsWithCycle ? 1 : 0);
  } else {
    t.cycle_count = 0;
  }

  for (std::int32_t c = f; c <= e; ++c) {
    LineTableEntry& entry = t.entries[static_cast<std::size_t>(c - f)];
    if (c < kWsInitialPackets) {
      const std::int32_t group = c / kWsGroupPackets;
      entry.channel_word = static_cast<std::int16_t>(order[static_cast<std::size_t>(group)]);
      entry.kind_word = c % kWsGroupPackets < kInitialNoisePackets ? kLineNoise : kLineInitialCalibration;
      continue;
    }
    std::size_t j = 0;
    std::int32_t q = 0;
    locate((c - kWsInitialPackets) % cycle, j, q);
    const WsSwathTimeline& w = swaths[static_cast<std::size_t>(order[j])];
    entry.channel_word = static_cast<std::int16_t>(order[j]);
    if (q < w.swathRank - 2) {
      entry.kind_word = kLineNoise;  // no echo of the burst has come back yet
    } else if (q == blockLines[j] - 1) {
      entry.kind_word = kLinePeriodicCalibration;
    } else {
      entry.kind_word = kLineEcho;
      if (q == w.swathRank - 2) entry.kind_word |= kLineBurstStart | (j == 0 ? kLineCycleStart : 0);
    }
  }
  return t;
}

// ---------------------------------------------------------------------------------------------
std::int32_t most_frequent_value(std::span<const std::int32_t> values) {
  constexpr std::size_t kSlots = 128;
  std::array<std::int32_t, kSlots> seen{};
  std::array<std::int32_t, kSlots> counts{};
  std::size_t used = 0;
  for (const std::int32_t v : values) {
    if (v == 0) continue;
    std::size_t k = 0;
    while (k < used && seen[k] != v) ++k;
    if (k == used) {
      if (used == kSlots) continue;
      seen[used++] = v;
    }
    ++counts[k];
  }
  std::size_t best = 0;
  for (std::size_t k = 1; k < used; ++k)
    if (counts[k] > counts[best]) best = k;
  return seen[best];
}

}  // namespace sar::envisat

#include <gtest/gtest.h>

#include <map>
#include <stdexcept>
#include <vector>

#include "envisat/line_table.hpp"

using namespace sar::envisat;

namespace {
constexpr double kPrf = 1652.0;
}

TEST(LineTable, ImKindsFollowTheCycleWhereverTheProductStarts) {
  const PacketMark last{5000, 100.0, true};
  const LineTable fromCalibration = build_im_table({3, 10.0, false}, last, kPrf);
  const LineTable midCycle = build_im_table({2000, 11.0, true}, last, kPrf);
  // The counters 0-7 are noise, 8-104 initial calibration, then 1023 echoes and a calibration.
  EXPECT_EQ(fromCalibration.at_counter(7).kind(), kLineNoise);
  EXPECT_EQ(fromCalibration.at_counter(8).kind(), kLineInitialCalibration);
  EXPECT_EQ(fromCalibration.at_counter(104).kind(), kLineInitialCalibration);
  EXPECT_EQ(fromCalibration.at_counter(105).kind_word, kLineEcho | kLineCycleStart);
  EXPECT_EQ(fromCalibration.at_counter(105 + 1022).kind_word, kLineEcho);
  EXPECT_EQ(fromCalibration.at_counter(105 + 1023).kind(), kLinePeriodicCalibration);
  EXPECT_EQ(fromCalibration.at_counter(105 + 1024).kind_word, kLineEcho | kLineCycleStart);
  for (std::int32_t c = 2000; c <= 5000; ++c)
    ASSERT_EQ(fromCalibration.at_counter(c).kind_word, midCycle.at_counter(c).kind_word) << c;
  EXPECT_EQ(fromCalibration.entries.size(), 4998u);
  EXPECT_EQ(fromCalibration.first_echo_counter, 105);
  EXPECT_DOUBLE_EQ(fromCalibration.first_echo_time, 10.0 + 102 / kPrf);
  EXPECT_EQ(midCycle.first_echo_counter, 2000);
  EXPECT_DOUBLE_EQ(midCycle.first_echo_time, 11.0);
  EXPECT_DOUBLE_EQ(midCycle.line_interval, 1.0 / kPrf);
  // Echo lines from the first echo up to, not including, the last packet: 3000 packets from
  // 2000 to 4999 less the calibration pulses at 2152, 3176 and 4200.
  EXPECT_EQ(midCycle.cycle_count, 2997);
}

TEST(LineTable, ImFirstPacketACalibrationPulseStartsOnePriLater) {
  const std::int32_t calibration = 105 + 3 * 1024 - 1;
  const LineTable t = build_im_table({calibration, 50.0, false}, {calibration + 3000, 60.0, true}, kPrf);
  EXPECT_EQ(t.entries.front().kind(), kLinePeriodicCalibration);
  EXPECT_EQ(t.first_echo_counter, calibration + 1);
  EXPECT_DOUBLE_EQ(t.first_echo_time, 50.0 + 1.0 / kPrf);
}

TEST(LineTable, ApCycleHoldsBothChannelsAndTheTwoPaddingSlots) {
  const std::int32_t l = 6;
  const std::int32_t cycle = 8 * l - 2;
  const LineTable t = build_ap_table({0, 0.0, false}, {210 + 3 * cycle - 1, 1.0, true}, kPrf, l);
  EXPECT_EQ(t.at_counter(7).channel_word, 0);
  EXPECT_EQ(t.at_counter(8).channel_word, 1);
  EXPECT_EQ(t.at_counter(15).kind(), kLineNoise);
  EXPECT_EQ(t.at_counter(16).kind(), kLineInitialCalibration);
  EXPECT_EQ(t.at_counter(112).channel_word, 0);
  EXPECT_EQ(t.at_counter(113).channel_word, 1);
  EXPECT_EQ(t.at_counter(210).kind_word, kLineEcho | kLineCycleStart);
  EXPECT_EQ(t.first_echo_counter, 210);
  EXPECT_DOUBLE_EQ(t.first_echo_time, 210 / kPrf);
  EXPECT_DOUBLE_EQ(ap_cycle_time(kPrf, l), 2.0 * l / kPrf);
  for (int k = 0; k < 3; ++k) {
    std::map<int, int> echoes, calibrations;
    for (std::int32_t q = 0; q < cycle; ++q) {
      const LineTableEntry& e = t.at_counter(210 + k * cycle + q);
      (e.kind() == kLineEcho ? echoes : calibrations)[e.channel_word]++;
    }
    // Each channel receives 4 L - 3 echoes and one calibration pulse a cycle; the two change-over
    // slots are padding.
    EXPECT_EQ(echoes[0], 4 * l - 3);
    EXPECT_EQ(echoes[1], 4 * l - 3);
    EXPECT_EQ(echoes[kPaddingChannel], 1);
    EXPECT_EQ(echoes[kPaddingChannel + 1], 1);
    EXPECT_EQ(calibrations[0], 1);
    EXPECT_EQ(calibrations[1], 1);
  }
  EXPECT_EQ(t.at_counter(210 + 2 * l - 1).channel_word, kPaddingChannel);
  EXPECT_EQ(t.at_counter(210 + 3 * l - 2).channel_word, kPaddingChannel + 1);
}

TEST(LineTable, WsBlocksAndCycleStarts) {
  std::array<WsSwathTimeline, 5> swaths{};
  const std::array<int, 5> ranks = {9, 12, 10, 13, 11};
  const std::array<int, 5> echoes = {50, 65, 55, 71, 60};
  const std::array<double, 5> prfs = {1700.0, 1650.0, 1690.0, 1600.0, 1680.0};
  for (std::size_t s = 0; s < 5; ++s) swaths[s] = {prfs[s], ranks[s], echoes[s]};
  const std::array<int, 5> order = {0, 2, 1, 4, 3};
  std::int32_t cycle = 0;
  double interval = 0.0;
  for (std::size_t s = 0; s < 5; ++s) {
    cycle += ranks[s] + echoes[s] - 1;
    interval += (ranks[s] + echoes[s]) / prfs[s];
  }
  const std::int32_t start = 525 + 3 * cycle;  // exactly at a cycle start
  const LineTable atStart = build_ws_table({start, 100.0, false}, {start + 4 * cycle - 1, 200.0, true}, swaths, order);
  EXPECT_EQ(atStart.lines_per_cycle, cycle);
  EXPECT_DOUBLE_EQ(atStart.line_interval, interval);
  EXPECT_EQ(atStart.first_cycle_index, 4);
  EXPECT_EQ(atStart.first_echo_counter, start);
  EXPECT_DOUBLE_EQ(atStart.first_echo_time, 100.0 + 8.0 / prfs[0]);
  EXPECT_EQ(atStart.cycle_count, 4);

  // One cycle: per block R - 2 noise lines, M echoes (the first flagged), one calibration.
  std::map<int, int> noise, echo, calibration, bursts;
  int cycleStarts = 0;
  for (std::int32_t c = start; c < start + cycle; ++c) {
    const LineTableEntry& e = atStart.at_counter(c);
    if (e.kind() == kLineNoise) noise[e.channel_word]++;
    if (e.kind() == kLineEcho) echo[e.channel_word]++;
    if (e.kind() == kLinePeriodicCalibration) calibration[e.channel_word]++;
    if (e.kind_word & kLineBurstStart) bursts[e.channel_word]++;
    if (e.kind_word & kLineCycleStart) ++cycleStarts;
  }
  for (int s = 0; s < 5; ++s) {
    EXPECT_EQ(noise[s], ranks[static_cast<std::size_t>(s)] - 2) << s;
    EXPECT_EQ(echo[s], echoes[static_cast<std::size_t>(s)]) << s;
    EXPECT_EQ(calibration[s], 1) << s;
    EXPECT_EQ(bursts[s], 1) << s;
  }
  EXPECT_EQ(cycleStarts, 1);
  // The first block after the start is swath 0's, the second swath 2's (firing order).
  EXPECT_EQ(atStart.at_counter(start + ranks[0] + echoes[0] - 1).channel_word, 2);

  // Starting mid-cycle or in the initial packets: the same period, from the next whole cycle.
  const LineTable mid = build_ws_table({start - 100, 99.0, true}, {start + 2 * cycle, 200.0, true}, swaths, order);
  EXPECT_EQ(mid.first_echo_counter, start);
  EXPECT_EQ(mid.first_cycle_index, 4);
  const LineTable early = build_ws_table({100, 1.0, false}, {start + 2 * cycle, 200.0, true}, swaths, order);
  EXPECT_EQ(early.first_echo_counter, 525);
  EXPECT_EQ(early.first_cycle_index, 1);
  EXPECT_EQ(early.at_counter(100).channel_word, 0);
  EXPECT_EQ(early.at_counter(105).channel_word, 2);
  EXPECT_EQ(early.at_counter(112).kind(), kLineNoise);
  EXPECT_EQ(early.at_counter(113).kind(), kLineInitialCalibration);
  for (std::int32_t c = start - 100; c <= start + 2 * cycle; ++c)
    ASSERT_EQ(early.at_counter(c).kind_word, mid.at_counter(c).kind_word) << c;
}

TEST(LineTable, BadTimelinesAreRefused) {
  std::array<WsSwathTimeline, 5> swaths{};
  swaths.fill({1700.0, 9, 50});
  EXPECT_THROW(build_im_table({500, 0, true}, {499, 0, true}, kPrf), std::invalid_argument);
  EXPECT_THROW(build_im_table({0, 0, true}, {10, 0, true}, 0.0), std::invalid_argument);
  EXPECT_THROW(build_ap_table({0, 0, true}, {10, 0, true}, kPrf, 0), std::invalid_argument);
  EXPECT_THROW(build_ws_table({0, 0, true}, {10, 0, true}, swaths, {0, 1, 2, 3, 5}), std::invalid_argument);
  EXPECT_THROW(build_im_table({0, 0, true}, {1 << 25, 0, true}, kPrf), std::invalid_argument);
  const LineTable t = build_im_table({200, 0, true}, {210, 0, true}, kPrf);
  EXPECT_THROW((void)t.at_counter(211), std::out_of_range);
}

TEST(LineTable, MostFrequentValue) {
  struct Case {
    std::vector<std::int32_t> values;
    std::int32_t expected;
  };
  const Case cases[] = {
      {{}, 0},
      {{0, 0, 0}, 0},                // zero entries are ignored
      {{0, 7, 7, 0, 0, 2}, 7},
      {{5, 3, 3, 5}, 5},             // a tie goes to the earliest
      {{1, 2, 2, 3, 3, 3, 0, 0, 0, 0}, 3},
  };
  for (const Case& c : cases) EXPECT_EQ(most_frequent_value(c.values), c.expected);
}

// Extraction of simulated alternating polarisation and wide swath products, compared with the
// simulator's truth: the channels' line grids, times and range windows, the bursts of each
// sub-swath, which packets each extraction kind selects, and the samples against the echoes
// before quantisation.
#include <gtest/gtest.h>

#include <cmath>
#include <complex>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <map>
#include <string>
#include <vector>

#include "base/errors.hpp"
#include "envisat/extract.hpp"
#include "envisat/table_builder.hpp"
#include "simulated_product.hpp"

using namespace sar::envisat;
namespace sim = sar::simulator;

namespace {

constexpr int kSamples = 128;

sim::SimulationConfig small_config(const std::string& tag, sim::AcquisitionMode mode, int lines) {
  sim::SimulationConfig c = sar::test::small_im_config(tag, {});
  c.mode = mode;
  c.lines = lines;
  c.samples = kSamples;
  return c;
}

// AP products: the block length of the template's IS2 is 200, so a cycle is 1598 packets; from
// the acquisition start 1500 packets hold the initial 210, the calibration pulse of channel 0
// and both change-overs.
sim::SimulationConfig ap_config(const std::string& tag, sim::AcquisitionMode mode, int firstCounter = -1) {
  sim::SimulationConfig c = small_config("apws_" + tag, mode, 1500);
  c.first_counter = firstCounter;
  return c;
}

// A WS cycle is about 360 packets: 2000 packets from the start hold the 525 initial ones and
// four whole cycles.
sim::SimulationConfig ws_config(const std::string& tag, int lines = 2000) {
  return small_config("apws_" + tag, sim::AcquisitionMode::kWS, lines);
}

struct Extracted {
  std::vector<sarpar> channels;
  extconf conf;
  LineTable table;
  std::vector<std::vector<std::uint8_t>> files;  // per channel: the line file, or the noise file
  bool ok = false;
};

std::vector<std::uint8_t> slurp(const std::string& path) {
  std::ifstream in(path, std::ios::binary);
  return {std::istreambuf_iterator<char>(in), std::istreambuf_iterator<char>()};
}

// The steps of envi_extract without its progress bar.
Extracted extract(const sim::SimulationTruth& t, const std::string& dir, int kind) {
  Extracted x;
  const std::string sub = dir + "/kind" + std::to_string(kind);
  std::filesystem::create_directories(sub);
  x.conf.extract_kind = kind;
  try {
    const Level0Header header = read_level0_header(t.level0_path);
    x.channels.resize(static_cast<std::size_t>(header.channels));
    for (std::size_t c = 0; c < x.channels.size(); ++c) {
      x.channels[c].outputDir = sub;
      x.channels[c].raw_file = sub + "/SS" + std::to_string(c + 1);
      x.channels[c].noise_file = sub + "/NOISE" + std::to_string(c + 1);
    }
    FbaqTables fbaq;
    EXPECT_EQ(LUTfbaq_f(t.ins_path, fbaq.q, fbaq.i), 0);
    std::vector<float> gains(kGainTableLength);
    EXPECT_EQ(read_gain_table(t.ins_path, gains), 0);
    EXPECT_EQ(timeline_table_builder()(t.level0_path, t.ins_path, header.mode, x.table, x.channels), 0);
    EXPECT_EQ(extract_level0(t.level0_path, header, x.table, fbaq, gains, x.channels, x.conf), 0);
  } catch (const sar::base::CErrorExceptionManager& e) {
    std::string what;
    for (const auto& d : e.details()) what += " | " + d;
    ADD_FAILURE() << "extraction raised " << e.ec() << what;
    return x;
  }
  for (const sarpar& p : x.channels) x.files.push_back(slurp(kind == kExtractNoise ? p.noise_file : p.raw_file));
  x.ok = true;
  return x;
}

// One record of a line file: the range time, then the samples.
struct LineView {
  float time = 0.0f;
  std::vector<std::complex<float>> samples;
};

constexpr std::size_t kRecordBytes = 4 + 8 * static_cast<std::size_t>(kSamples);

LineView line_at(const std::vector<std::uint8_t>& file, std::size_t l) {
  LineView v;
  const std::uint8_t* at = file.data() + kRecordBytes * l;
  std::memcpy(&v.time, at, 4);
  v.samples.resize(kSamples);
  std::memcpy(v.samples.data(), at + 4, 8 * static_cast<std::size_t>(kSamples));
  return v;
}

std::size_t records(const std::vector<std::uint8_t>& file) { return file.size() / kRecordBytes; }

// Quantisation SNR of decoded lines against the truth's echoes divided by the receive gain.
struct SnrSum {
  double signal = 0.0, error = 0.0;
  void add(const sim::SimulationTruth& t, const std::vector<double>& gain, std::size_t packet, const LineView& v) {
    for (std::size_t k = 0; k < kSamples; ++k) {
      const auto truth = std::complex<double>(t.echoes[packet * kSamples + k]) / gain[k];
      signal += std::norm(truth);
      error += std::norm(std::complex<double>(v.samples[k]) - truth);
    }
  }
  double db() const { return 10.0 * std::log10(signal / error); }
};

// ---------------------------------------------------------------------------------------------
// Alternating polarisation.

struct ApCase {
  const char* name;
  sim::AcquisitionMode mode;
  int firstCounter;                // -1: the acquisition start
  std::array<int, 2> polarization; // polarization_type of channels 0 and 1
};

void PrintTo(const ApCase& c, std::ostream* os) { *os << c.name; }

class SimulatedAp : public ::testing::TestWithParam<ApCase> {};

TEST_P(SimulatedAp, GivesTwoChannelsOnTheTruthsLineGrid) {
  const ApCase& param = GetParam();
  const sim::SimulationConfig c = ap_config(param.name, param.mode, param.firstCounter);
  const sim::SimulationTruth& t = sar::test::simulated(c);
  const Extracted x = extract(t, c.out_dir, kExtractEchoes);
  ASSERT_TRUE(x.ok);
  ASSERT_EQ(x.channels.size(), 2u);
  const sim::ChannelTruth& truth = t.channels.at(0);
  const int lines = t.channel_lines;

  for (std::size_t ch = 0; ch < 2; ++ch) {
    SCOPED_TRACE(ch);
    const sarpar& p = x.channels[ch];
    EXPECT_EQ(p.lines, lines);
    ASSERT_EQ(records(x.files[ch]), static_cast<std::size_t>(lines));
    EXPECT_NEAR(p.azimuthStartTime, t.first_line_time, 1e-6);
    EXPECT_DOUBLE_EQ(p.prf, truth.prf);
    EXPECT_NEAR(p.nearRangeTime, truth.near_range_time, 1e-12);
    EXPECT_NEAR(p.far_range_time, truth.near_range_time, 1e-12);
    EXPECT_EQ(p.swst_code, truth.swst_code);
    EXPECT_EQ(p.swath_rank, truth.swath_rank);
    EXPECT_EQ(p.burst_echoes, truth.burst_echoes);
    EXPECT_DOUBLE_EQ(p.cycle_time, 2.0 * truth.burst_echoes / truth.prf);
    EXPECT_EQ(p.swath_number, c.im.beam_code);  // alternating polarisation keeps the beam code
    EXPECT_EQ(p.polarization_type, param.polarization[ch]);
    EXPECT_EQ(p.noise_packets, 0);
    ASSERT_EQ(x.conf.line_replaced[ch].size(), static_cast<std::size_t>(lines));
  }

  // Line by line: an echo lies in its own channel's file, zeros in the other's; calibration
  // pulses and the skipped PRIs of the change-overs leave stand-in lines in both.
  std::vector<int> kindOfLine(static_cast<std::size_t>(lines), -1);  // -1: skipped PRI
  const std::vector<double> gain = sim::receive_gain(c.im, kSamples);
  std::array<SnrSum, 2> snr;
  int calibrations = 0, echoes = 0;
  for (std::size_t i = 0; i < t.packets.size(); ++i) {
    const sim::PacketTruth& pk = t.packets[i];
    if (pk.grid_line < 0 || pk.grid_line >= lines) continue;
    const auto l = static_cast<std::size_t>(pk.grid_line);
    const auto own = static_cast<std::size_t>(pk.channel), other = 1 - own;
    kindOfLine[l] = static_cast<int>(pk.kind);
    const LineView mine = line_at(x.files[own], l), theirs = line_at(x.files[other], l);
    EXPECT_EQ(theirs.samples, std::vector<std::complex<float>>(kSamples)) << "line " << l;
    EXPECT_FLOAT_EQ(mine.time, static_cast<float>(truth.near_range_time)) << "line " << l;
    if (pk.kind == sim::PacketKind::kEcho) {
      ++echoes;
      snr[own].add(t, gain, i, mine);
      // The echo's own channel holds a genuine line; the other a zero stand-in.
      EXPECT_EQ(x.conf.line_replaced[own][l], 0) << "line " << l;
      EXPECT_EQ(x.conf.line_counter[own][l], pk.counter) << "line " << l;
      EXPECT_EQ(x.conf.line_replaced[other][l], 1) << "line " << l;
      EXPECT_EQ(x.conf.line_counter[other][l], 0) << "line " << l;
      for (std::size_t ch = 0; ch < 2; ++ch) EXPECT_EQ(x.conf.line_swst[ch][l], truth.swst_code) << "line " << l;
    } else {
      ASSERT_EQ(pk.kind, sim::PacketKind::kPeriodicCalibration) << "line " << l;
      ++calibrations;
      for (std::size_t ch = 0; ch < 2; ++ch) EXPECT_EQ(x.conf.line_replaced[ch][l], 1) << "line " << l;
    }
  }
  int skipped = 0;
  for (std::size_t l = 0; l < kindOfLine.size(); ++l) {
    if (kindOfLine[l] != -1) continue;
    ++skipped;
    for (std::size_t ch = 0; ch < 2; ++ch) {
      EXPECT_EQ(line_at(x.files[ch], l).samples, std::vector<std::complex<float>>(kSamples)) << "line " << l;
      EXPECT_EQ(x.conf.line_replaced[ch][l], 1) << "line " << l;
      EXPECT_EQ(x.conf.line_counter[ch][l], 0) << "line " << l;
    }
  }
  // The products cross both change-overs and at least one calibration pulse.
  EXPECT_EQ(skipped, 2);
  EXPECT_GE(calibrations, 1);
  EXPECT_EQ(echoes + calibrations + skipped, lines);
  for (std::size_t ch = 0; ch < 2; ++ch) {
    RecordProperty("fbaq_snr_db_" + std::to_string(ch), std::to_string(snr[ch].db()));
    EXPECT_GT(snr[ch].db(), 18.0) << "channel " << ch;
  }
}

INSTANTIATE_TEST_SUITE_P(
    Modes, SimulatedAp,
    ::testing::Values(ApCase{"apc_start", sim::AcquisitionMode::kAPC, -1, {1, 0}},
                      ApCase{"aph_start", sim::AcquisitionMode::kAPH, -1, {2, 0}},
                      // Mid-cycle, a few packets before channel 1's pulse of the fourth cycle,
                      // then into the change-overs of the fifth.
                      ApCase{"apv_mid_cycle", sim::AcquisitionMode::kAPV, 210 + 3 * 1598 + 1150, {1, 3}}),
    [](const auto& info) { return std::string(info.param.name); });

TEST(SimulatedAp, InitialNoiseAndCalibrationAreSkippedWhateverTheKind) {
  const sim::SimulationConfig c = ap_config("apc_start", sim::AcquisitionMode::kAPC);
  const sim::SimulationTruth& t = sar::test::simulated(c);
  // The stream opens with 16 noise packets and 194 initial calibration pulses.
  std::map<sim::PacketKind, int> initial;
  for (const sim::PacketTruth& p : t.packets)
    if (p.counter < 210) ++initial[p.kind];
  EXPECT_EQ(initial[sim::PacketKind::kNoise], 16);
  EXPECT_EQ(initial[sim::PacketKind::kInitialCalibration], 194);

  // Noise of alternating polarisation lies before the walk and is never written.
  const Extracted noise = extract(t, c.out_dir, kExtractNoise);
  ASSERT_TRUE(noise.ok);
  for (std::size_t ch = 0; ch < 2; ++ch) {
    EXPECT_TRUE(noise.files[ch].empty());
    EXPECT_EQ(noise.channels[ch].noise_packets, 0);
  }
  for (std::int32_t counter = 0; counter < 210; ++counter)
    EXPECT_EQ(noise.table.at_counter(counter).kind_word & kLineSelected, 0) << counter;
}

// An echo lost in the middle of a channel-1 block: the walk fills its line in channel 1 with the
// last channel-1 echo and in channel 0 with zeros, both marked as stand-ins, and the grid goes
// on; the product's calibration pulse and the change-overs' padding slots keep their lines too.
TEST(SimulatedAp, LostEchoInsideAChannelOneBlockKeepsTheGrid) {
  sim::SimulationConfig c = ap_config("aph_lost", sim::AcquisitionMode::kAPH);
  const sim::SimulationTruth& clean = sar::test::simulated(c);
  // The middle echo of the first channel-1 block after the initial packets.
  std::vector<std::size_t> block;
  for (std::size_t i = 0; i < clean.packets.size(); ++i) {
    const sim::PacketTruth& p = clean.packets[i];
    if (p.counter < 210 || p.kind != sim::PacketKind::kEcho) continue;
    if (p.channel == 1) block.push_back(i);
    else if (!block.empty()) break;
  }
  ASSERT_GT(block.size(), 10u);
  const std::size_t lostIndex = block[block.size() / 2];
  c.out_dir += "_lost";
  c.lost_packets = {static_cast<int>(lostIndex)};
  const sim::SimulationTruth& t = sar::test::simulated(c);
  ASSERT_EQ(t.lost_lines, (std::vector<int>{static_cast<int>(lostIndex)}));
  const Extracted x = extract(t, c.out_dir, kExtractEchoes);
  ASSERT_TRUE(x.ok);
  const auto lostLine = static_cast<std::size_t>(t.packets[lostIndex].grid_line);
  const auto before = static_cast<std::size_t>(t.packets[lostIndex - 1].grid_line);
  ASSERT_EQ(before + 1, lostLine);
  EXPECT_EQ(x.channels[0].lines, t.channel_lines);  // no line lost from the grid
  EXPECT_EQ(line_at(x.files[1], lostLine).samples, line_at(x.files[1], before).samples);
  EXPECT_EQ(line_at(x.files[0], lostLine).samples, std::vector<std::complex<float>>(kSamples));
  for (std::size_t ch = 0; ch < 2; ++ch) {
    EXPECT_EQ(x.conf.line_replaced[ch][lostLine], 1) << ch;
    EXPECT_EQ(x.conf.line_counter[ch][lostLine], 0) << ch;
  }
  // The neighbours are genuine channel-1 echoes.
  EXPECT_EQ(x.conf.line_replaced[1][before], 0);
  EXPECT_EQ(x.conf.line_counter[1][lostLine + 1], t.packets[lostIndex + 1].counter);

  // Every line is accounted for: echoes in their own channel, stand-ins in both for the lost
  // echo, the calibration pulses and the padding slots of the change-overs.
  int genuine = 0, standIns = 0, calibrations = 0, padding = 0;
  std::vector<int> kind(static_cast<std::size_t>(t.channel_lines), -1);
  for (const sim::PacketTruth& p : t.packets)
    if (p.grid_line >= 0 && p.grid_line < t.channel_lines) kind[static_cast<std::size_t>(p.grid_line)] = static_cast<int>(p.kind);
  for (std::size_t l = 0; l < kind.size(); ++l) {
    const bool replaced0 = x.conf.line_replaced[0][l] == 1, replaced1 = x.conf.line_replaced[1][l] == 1;
    if (!replaced0 || !replaced1) {
      ++genuine;
      EXPECT_NE(replaced0, replaced1) << "line " << l;  // one channel holds the echo, the other a stand-in
      continue;
    }
    ++standIns;
    if (kind[l] == static_cast<int>(sim::PacketKind::kPeriodicCalibration)) ++calibrations;
    if (kind[l] == -1) ++padding;
  }
  EXPECT_GE(calibrations, 1);
  EXPECT_EQ(padding, 2);
  EXPECT_EQ(standIns, calibrations + padding + 1);
  EXPECT_EQ(genuine + standIns, t.channel_lines);
}

// Packets whose polarisation bits name the other channel than the timeline: the product is
// not the sub-mode it says, and the extraction refuses it, naming the first such packet.
TEST(SimulatedAp, PolarisationBitsAgainstTheTimelineAreRefused) {
  sim::SimulationConfig c = ap_config("apv_swapped", sim::AcquisitionMode::kAPV);
  c.faults = {sim::Fault::kSwappedPolarisation};
  const sim::SimulationTruth& t = sar::test::simulated(c);
  const Level0Header header = read_level0_header(t.level0_path);
  std::vector<sarpar> channels(2);
  const std::string dir = c.out_dir + "/swapped";
  std::filesystem::create_directories(dir);
  for (std::size_t k = 0; k < 2; ++k) channels[k].raw_file = dir + "/SS" + std::to_string(k + 1);
  FbaqTables fbaq;
  ASSERT_EQ(LUTfbaq_f(t.ins_path, fbaq.q, fbaq.i), 0);
  std::vector<float> gains(kGainTableLength);
  ASSERT_EQ(read_gain_table(t.ins_path, gains), 0);
  LineTable table;
  extconf conf;
  try {
    timeline_table_builder()(t.level0_path, t.ins_path, header.mode, table, channels);
    extract_level0(t.level0_path, header, table, fbaq, gains, channels, conf);
    ADD_FAILURE() << "extraction took a product whose packets contradict its timeline";
  } catch (const sar::base::CErrorExceptionManager& e) {
    EXPECT_EQ(e.ec(), sar::base::ec::kBadArguments);
    ASSERT_EQ(e.details().size(), 3u);
    EXPECT_EQ(e.details()[0], "ASA_AP0");
    EXPECT_NE(e.details()[1].find("polarisation contradicts the timeline"), std::string::npos) << e.details()[1];
    EXPECT_NE(e.details()[2].find("packet counter"), std::string::npos) << e.details()[2];
  }
  // Nothing that looks like a line file is left.
  for (const sarpar& p : channels) EXPECT_FALSE(std::filesystem::exists(p.raw_file)) << p.raw_file;
}

// ---------------------------------------------------------------------------------------------
// Wide swath.

struct WsExpect {
  std::array<std::vector<std::size_t>, 5> echoPackets;  // per sub-swath, in order
  std::array<std::vector<std::size_t>, 5> noisePackets;
};

// The packets of the truth's whole cycles, which the extraction walks.
WsExpect ws_expect(const sim::SimulationTruth& t) {
  WsExpect e;
  const long long firstCycle = (t.first_cycle_counter - 525) / t.cycle_packets;
  for (std::size_t i = 0; i < t.packets.size(); ++i) {
    const sim::PacketTruth& p = t.packets[i];
    if (p.cycle < firstCycle || p.cycle >= firstCycle + t.whole_cycles) continue;
    const auto s = static_cast<std::size_t>(p.channel);
    if (p.kind == sim::PacketKind::kEcho) e.echoPackets[s].push_back(i);
    if (p.kind == sim::PacketKind::kNoise) e.noisePackets[s].push_back(i);
  }
  return e;
}

class SimulatedWs : public ::testing::TestWithParam<int> {};

sim::SimulationConfig ws_case(int which) {
  if (which == 0) return ws_config("ws_start");
  // Mid-cycle, in another firing order: the extraction begins at the next whole cycle.
  sim::SimulationConfig c = ws_config("ws_mid_cycle", 1700);
  c.ws.order = {0, 2, 4, 1, 3};
  c.first_counter = 525 + 5 * 357 + 100;
  return c;
}

TEST_P(SimulatedWs, GivesEachSubSwathsBurstsWithTheTruthsTiming) {
  const sim::SimulationConfig c = ws_case(GetParam());
  const sim::SimulationTruth& t = sar::test::simulated(c);
  ASSERT_GE(t.whole_cycles, 3);
  const Extracted x = extract(t, c.out_dir, kExtractEchoes);
  ASSERT_TRUE(x.ok);
  ASSERT_EQ(x.channels.size(), 5u);
  const WsExpect e = ws_expect(t);
  const std::vector<double> gain = sim::receive_gain(c.im, kSamples);

  double cycleTime = 0.0;
  int totalLines = 0;
  for (const sim::ChannelTruth& ch : t.channels) {
    cycleTime += (ch.swath_rank + ch.burst_echoes) / ch.prf;
    totalLines += t.whole_cycles * ch.burst_echoes;
  }
  EXPECT_EQ(x.table.lines_per_cycle, t.cycle_packets);
  EXPECT_EQ(x.table.first_echo_counter, t.first_cycle_counter);
  EXPECT_EQ(x.table.cycle_count, t.whole_cycles);
  for (std::size_t s = 0; s < 5; ++s) {
    SCOPED_TRACE(s);
    const sarpar& p = x.channels[s];
    const sim::ChannelTruth& truth = t.channels[s];
    EXPECT_EQ(p.ss_order, c.ws.order[s]);  // the sub-swath fired s-th
    EXPECT_EQ(p.swath_number, static_cast<int>(s) + 1);
    EXPECT_EQ(p.burst_count, t.whole_cycles);
    EXPECT_EQ(p.burst_echoes, truth.burst_echoes);
    EXPECT_EQ(p.swath_rank, truth.swath_rank);
    EXPECT_DOUBLE_EQ(p.prf, truth.prf);
    EXPECT_EQ(p.swst_code, truth.swst_code);
    EXPECT_EQ(p.swst_max_code, truth.swst_code);
    EXPECT_EQ(p.swst_change_count, 0);
    EXPECT_NEAR(p.nearRangeTime, truth.near_range_time, 1e-12);
    EXPECT_NEAR(p.cycle_time, cycleTime, 1e-12);
    EXPECT_EQ(p.polarization_type, 0);  // H/H from the SPH
    EXPECT_EQ(p.lines, totalLines);     // the output line number counts every sub-swath's echoes
    EXPECT_NEAR(p.azimuthStartTime, t.first_line_time, 1e-6);

    // M echoes a burst, the noise packets before them and the pulse after them left out.
    ASSERT_EQ(e.echoPackets[s].size(), static_cast<std::size_t>(t.whole_cycles * truth.burst_echoes));
    ASSERT_EQ(records(x.files[s]), e.echoPackets[s].size());
    SnrSum snr;
    for (std::size_t l = 0; l < e.echoPackets[s].size(); ++l) {
      const LineView v = line_at(x.files[s], l);
      ASSERT_FLOAT_EQ(v.time, static_cast<float>(truth.near_range_time)) << "line " << l;
      snr.add(t, gain, e.echoPackets[s][l], v);
    }
    RecordProperty("fbaq_snr_db_ss" + std::to_string(s + 1), std::to_string(snr.db()));
    EXPECT_GT(snr.db(), 18.0);

    // The noise packets of the walk are counted even when echoes are extracted.
    EXPECT_EQ(p.noise_packets, t.whole_cycles * (truth.swath_rank - 2));
  }
  // The first line is the first echo of the first whole cycle's first burst, a burst start.
  ASSERT_FALSE(e.echoPackets[static_cast<std::size_t>(c.ws.order[0])].empty());
  const sim::PacketTruth& firstEcho = t.packets[e.echoPackets[static_cast<std::size_t>(c.ws.order[0])].front()];
  EXPECT_TRUE(firstEcho.burst_start);
  EXPECT_DOUBLE_EQ(firstEcho.time, t.first_line_time);
}

INSTANTIATE_TEST_SUITE_P(Products, SimulatedWs, ::testing::Values(0, 1),
                         [](const auto& info) { return info.param == 0 ? std::string("start") : std::string("mid_cycle"); });

TEST(SimulatedWs, NoisePacketsAreSelectedOnlyWhenAsked) {
  const sim::SimulationConfig c = ws_case(0);
  const sim::SimulationTruth& t = sar::test::simulated(c);
  const WsExpect e = ws_expect(t);
  const Extracted echoes = extract(t, c.out_dir, kExtractEchoes);
  const Extracted noise = extract(t, c.out_dir, kExtractNoise);
  ASSERT_TRUE(echoes.ok);
  ASSERT_TRUE(noise.ok);

  // The selection marks exactly the walked entries of the kind asked for.
  for (const Extracted* x : {&echoes, &noise}) {
    const int kind = x->conf.extract_kind;
    std::map<int, int> selected;
    for (const LineTableEntry& entry : x->table.entries)
      if (entry.kind_word & kLineSelected) {
        EXPECT_EQ(entry.kind(), kind);
        ++selected[entry.channel_word];
      }
    for (std::size_t s = 0; s < 5; ++s) {
      const auto& want = kind == kExtractNoise ? e.noisePackets[s] : e.echoPackets[s];
      EXPECT_EQ(selected[static_cast<int>(s)], static_cast<int>(want.size())) << "kind " << kind << " SS" << s + 1;
    }
  }

  for (std::size_t s = 0; s < 5; ++s) {
    SCOPED_TRACE(s);
    const sim::ChannelTruth& truth = t.channels[s];
    // Noise lines: one a noise packet of the walk, its range time and its levels; no echo file.
    ASSERT_EQ(records(noise.files[s]), e.noisePackets[s].size());
    EXPECT_FALSE(std::filesystem::exists(noise.channels[s].raw_file));
    double meanPower = 0.0;
    for (std::size_t l = 0; l < e.noisePackets[s].size(); ++l) {
      const LineView v = line_at(noise.files[s], l);
      EXPECT_FLOAT_EQ(v.time, static_cast<float>(truth.near_range_time));
      double power = 0.0;
      for (const auto& z : v.samples) power += std::norm(std::complex<double>(z));
      const double expected = t.packets[e.noisePackets[s][l]].noise_power;
      EXPECT_NEAR(power / kSamples, expected, 1e-6 * expected + 1e-12) << "noise line " << l;
      meanPower += expected;
    }
    meanPower /= static_cast<double>(e.noisePackets[s].size());
    EXPECT_EQ(noise.channels[s].noise_packets, static_cast<int>(e.noisePackets[s].size()));
    EXPECT_NEAR(noise.channels[s].mean_noise_power, meanPower, 1e-6 * meanPower);
    EXPECT_NEAR(echoes.channels[s].mean_noise_power, meanPower, 1e-6 * meanPower);
    EXPECT_EQ(noise.channels[s].lines, 0);
    // Echo extraction wrote no noise file; its echo lines keep the burst timing.
    EXPECT_FALSE(std::filesystem::exists(echoes.channels[s].noise_file));
    EXPECT_EQ(records(echoes.files[s]), e.echoPackets[s].size());
  }
  EXPECT_NEAR(echoes.channels[0].azimuthStartTime, t.first_line_time, 1e-6);
}

TEST(SimulatedWs, AuxiliaryProductHoldsTheAcquisitionsTimeline) {
  const sim::SimulationConfig c = ws_case(0);
  const sim::SimulationTruth& t = sar::test::simulated(c);
  const InsRecord ins = InsRecord::read(t.ins_path);
  const InsRecord real = InsRecord::read(sar::test::kInsTemplate);
  for (std::size_t s = 0; s < 5; ++s) {
    const int beam = 15 + static_cast<int>(s);
    EXPECT_EQ(ins.swath_rank(Timeline::kWs, beam), t.channels[s].swath_rank) << beam;
    EXPECT_EQ(ins.burst_echoes(Timeline::kWs, beam), t.channels[s].burst_echoes) << beam;
    // Burst lengths are the template's, and so are the ranks for this geometry.
    EXPECT_EQ(ins.burst_echoes(Timeline::kWs, beam), real.burst_echoes(Timeline::kWs, beam)) << beam;
    EXPECT_EQ(ins.swath_rank(Timeline::kWs, beam), real.swath_rank(Timeline::kWs, beam)) << beam;
  }
  // The IM and AP tables stay the template's.
  for (int beam = 1; beam <= 7; ++beam) {
    EXPECT_EQ(ins.swath_rank(Timeline::kIm, beam), real.swath_rank(Timeline::kIm, beam));
    EXPECT_EQ(ins.burst_echoes(Timeline::kAp, beam), real.burst_echoes(Timeline::kAp, beam));
  }
}

// ---------------------------------------------------------------------------------------------
// Calibration pulses and the image mode acquisition start.

// Records of a calibration file: the pulse's time (double) and antenna row (int32), then the
// samples of the calibration window.
struct CalibrationLine {
  double time = 0.0;
  std::int32_t row = 0;
};

std::vector<CalibrationLine> calibration_lines(const std::string& path, int width) {
  const std::vector<std::uint8_t> bytes = slurp(path);
  const std::size_t record = 12 + 8 * static_cast<std::size_t>(width);
  EXPECT_EQ(bytes.size() % record, 0u) << path;
  std::vector<CalibrationLine> lines(bytes.size() / record);
  for (std::size_t l = 0; l < lines.size(); ++l) {
    std::memcpy(&lines[l].time, bytes.data() + l * record, 8);
    std::memcpy(&lines[l].row, bytes.data() + l * record + 8, 4);
  }
  return lines;
}

TEST(SimulatedApWs, CalibrationPulsesAreSelectedOnlyWhenAsked) {
  for (const sim::SimulationConfig& c : {ap_config("apc_start", sim::AcquisitionMode::kAPC), ws_case(0)}) {
    const sim::SimulationTruth& t = sar::test::simulated(c);
    SCOPED_TRACE(t.product_name);
    const bool ws = c.mode == sim::AcquisitionMode::kWS;
    const Extracted x = extract(t, c.out_dir, kExtractCalibration);
    ASSERT_TRUE(x.ok);
    // The periodic pulses of the walk: in the whole cycles (WS), on the line grid (AP).
    const long long firstCycle = ws ? (t.first_cycle_counter - 525) / t.cycle_packets : 0;
    std::vector<std::vector<const sim::PacketTruth*>> pulses(x.channels.size());
    for (const sim::PacketTruth& p : t.packets) {
      if (p.kind != sim::PacketKind::kPeriodicCalibration) continue;
      const bool walked = ws ? p.cycle >= firstCycle && p.cycle < firstCycle + t.whole_cycles
                             : p.grid_line >= 0 && p.grid_line < t.channel_lines;
      if (walked) pulses[static_cast<std::size_t>(p.channel)].push_back(&p);
    }
    for (std::size_t ch = 0; ch < x.channels.size(); ++ch) {
      SCOPED_TRACE(ch);
      ASSERT_FALSE(pulses[ch].empty());
      EXPECT_TRUE(x.files[ch].empty());  // no echo line is written
      for (const char* name : {"CAL1SS", "CAL1ASS", "CAL2SS", "CAL3SS"}) {
        const auto lines = calibration_lines(x.channels[ch].outputDir + "/" + name + std::to_string(ch + 1),
                                             c.im.calibration_swl);
        ASSERT_EQ(lines.size(), pulses[ch].size()) << name;
        for (std::size_t l = 0; l < lines.size(); ++l) {
          EXPECT_NEAR(lines[l].time, pulses[ch][l]->time, 1e-6) << name << " line " << l;
          EXPECT_EQ(lines[l].row, pulses[ch][l]->calibration_row) << name << " line " << l;
        }
      }
    }
  }
}

TEST(SimulatedIm, AcquisitionStartOpensWithNoiseAndCalibrationThatEchoExtractionSkips) {
  sim::SimulationConfig c = small_config("apws_im_start", sim::AcquisitionMode::kIM, 600);
  c.first_counter = 0;
  const sim::SimulationTruth& t = sar::test::simulated(c);
  std::map<sim::PacketKind, int> kinds;
  for (const sim::PacketTruth& p : t.packets) ++kinds[p.kind];
  EXPECT_EQ(kinds[sim::PacketKind::kNoise], 8);
  EXPECT_EQ(kinds[sim::PacketKind::kInitialCalibration], 97);
  EXPECT_EQ(kinds[sim::PacketKind::kEcho], 600 - 105);
  EXPECT_EQ(t.packets[105].time, t.first_line_time);

  const Extracted x = extract(t, c.out_dir, kExtractEchoes);
  ASSERT_TRUE(x.ok);
  const sarpar& p = x.channels.at(0);
  EXPECT_NEAR(p.azimuthStartTime, t.first_line_time, 1e-6);
  EXPECT_EQ(p.noise_packets, 0);
  // The image mode timeline counts the lines from the first echo to the last packet less the
  // cycles' pulses up to the last packet's cycle: here the last two packets fall out.
  EXPECT_EQ(p.lines, t.channel_lines - 2);
  ASSERT_EQ(records(x.files[0]), static_cast<std::size_t>(p.lines));
  const std::vector<double> gain = sim::receive_gain(c.im, kSamples);
  SnrSum snr;
  for (int l = 0; l < p.lines; ++l) snr.add(t, gain, static_cast<std::size_t>(105 + l), line_at(x.files[0], static_cast<std::size_t>(l)));
  EXPECT_GT(snr.db(), 18.0);
}

}  // namespace

// Whole IM extraction of simulated products, compared with the simulator's truth: the line grid,
// times, range window, side tables, and the samples against the echoes before quantisation.
#include <gtest/gtest.h>

#include <cmath>
#include <complex>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <set>
#include <string>
#include <vector>

#include "base/errors.hpp"
#include "envisat/extract.hpp"
#include "envisat/table_builder.hpp"
#include "simulated_product.hpp"

using namespace sar::envisat;
namespace sim = sar::simulator;

namespace {

struct Extracted {
  std::vector<sarpar> channels;
  extconf conf;
  std::vector<std::uint8_t> lineFile;
};

// The steps of envi_extract without its progress bar, which needs a host's working file (the
// job tests run the whole stage through the focussing executable).
Extracted extract(const sim::SimulationTruth& t, const std::string& dir) {
  Extracted x;
  sarpar p;
  p.outputDir = dir;
  p.extrPath = dir + "/EXTR";
  x.channels = {p};
  try {
    const Level0Header header = read_level0_header(t.level0_path);
    FbaqTables fbaq;
    EXPECT_EQ(LUTfbaq_f(t.ins_path, fbaq.q, fbaq.i), 0);
    std::vector<float> gains(kGainTableLength);
    EXPECT_EQ(read_gain_table(t.ins_path, gains), 0);
    LineTable table;
    EXPECT_EQ(header.mode, kModeIM);
    EXPECT_EQ(timeline_table_builder()(t.level0_path, t.ins_path, header.mode, table, x.channels), 0);
    EXPECT_EQ(extract_level0(t.level0_path, header, table, fbaq, gains, x.channels, x.conf), 0);
  } catch (const sar::base::CErrorExceptionManager& e) {
    std::string what;
    for (const auto& d : e.details()) what += " | " + d;
    ADD_FAILURE() << "extraction raised " << e.ec() << what;
    return x;
  }
  std::ifstream in(p.extrPath, std::ios::binary);
  x.lineFile.assign(std::istreambuf_iterator<char>(in), std::istreambuf_iterator<char>());
  return x;
}

// One record of the line file: the range time, then the samples.
struct LineView {
  float time = 0.0f;
  std::vector<std::complex<float>> samples;
};

LineView line_at(const Extracted& x, int samples, int l) {
  const std::size_t bytes = 4 + 8 * static_cast<std::size_t>(samples);
  const std::uint8_t* at = x.lineFile.data() + bytes * static_cast<std::size_t>(l);
  LineView v;
  std::memcpy(&v.time, at, 4);
  v.samples.resize(static_cast<std::size_t>(samples));
  std::memcpy(v.samples.data(), at + 4, 8 * static_cast<std::size_t>(samples));
  return v;
}

struct Case {
  const char* name;
  std::vector<sim::Fault> faults;
};

void PrintTo(const Case& c, std::ostream* os) { *os << c.name; }

class SimulatedExtraction : public ::testing::TestWithParam<Case> {};

TEST_P(SimulatedExtraction, MatchesTheTruth) {
  const sim::SimulationConfig c = sar::test::small_im_config(std::string("extract_") + GetParam().name, GetParam().faults);
  const sim::SimulationTruth& t = sar::test::simulated(c);
  const Extracted x = extract(t, c.out_dir);
  const sarpar& p = x.channels.at(0);
  const int lines = sar::test::expected_im_lines(t);
  ASSERT_EQ(x.channels.size(), 1u);

  // The line grid and its times.
  EXPECT_EQ(p.lines, lines);
  ASSERT_EQ(x.lineFile.size(), static_cast<std::size_t>(lines) * (4 + 8 * static_cast<std::size_t>(c.samples)));
  EXPECT_NEAR(p.azimuthStartTime, t.first_line_time, 1e-6);
  EXPECT_DOUBLE_EQ(p.prf, t.prf);
  EXPECT_EQ(p.samples, c.samples);
  EXPECT_EQ(p.swath_number, c.im.beam_code);  // the SPH swath digit
  EXPECT_EQ(p.polarization_type, 0);          // H/H

  // Range window: the near range from the smallest SWST, the far one from the largest.
  const int after = t.swst_change_line >= 0 ? t.swst_code_after_change : t.swst_code;
  auto near_of = [&](int swst) { return swst / c.im.sampling_frequency + t.swath_rank / t.prf - c.im.range_gate_bias; };
  EXPECT_NEAR(p.nearRangeTime, t.near_range_time, 1e-12);
  EXPECT_NEAR(p.far_range_time, near_of(std::max(after, t.swst_code)), 1e-12);
  EXPECT_EQ(p.swst_change_count, t.swst_change_line >= 0 ? 1 : 0);

  // Side tables, line by line: SWST in force, the stand-in lines (lost packets and the
  // calibration pulse) flagged, the counters of the genuine echoes.
  const std::set<int> lost(t.lost_lines.begin(), t.lost_lines.end());
  const std::set<int> calibration(t.calibration_lines.begin(), t.calibration_lines.end());
  ASSERT_EQ(x.conf.line_swst[0].size(), static_cast<std::size_t>(lines));
  ASSERT_EQ(x.conf.line_replaced[0].size(), static_cast<std::size_t>(lines));
  ASSERT_EQ(x.conf.line_counter[0].size(), static_cast<std::size_t>(lines));
  for (int l = 0; l < lines; ++l) {
    const auto i = static_cast<std::size_t>(l);
    const int swst = t.swst_change_line >= 0 && l >= t.swst_change_line ? t.swst_code_after_change : t.swst_code;
    const bool standIn = lost.count(l) || calibration.count(l);
    EXPECT_EQ(x.conf.line_swst[0][i], swst) << "line " << l;
    EXPECT_EQ(x.conf.line_replaced[0][i], standIn ? 1 : 0) << "line " << l;
    EXPECT_EQ(x.conf.line_counter[0][i], standIn ? 0 : t.first_counter + l) << "line " << l;
    EXPECT_FLOAT_EQ(line_at(x, c.samples, l).time, static_cast<float>(near_of(swst))) << "line " << l;
  }
  // A lost packet's line repeats the last good line.
  for (int l : t.lost_lines)
    EXPECT_EQ(line_at(x, c.samples, l).samples, line_at(x, c.samples, t.lost_lines.front() - 1).samples) << l;

  // FBAQ round trip: the decoded, gain-corrected samples against the signal the ADC saw.
  ASSERT_EQ(t.echoes.size(), static_cast<std::size_t>(t.line_count) * static_cast<std::size_t>(c.samples));
  const std::vector<double> gain = sim::receive_gain(c.im, c.samples);
  double signal = 0.0, error = 0.0;
  for (int l = 0; l < lines; ++l) {
    if (lost.count(l) || calibration.count(l)) continue;
    const LineView v = line_at(x, c.samples, l);
    for (int k = 0; k < c.samples; ++k) {
      const auto truth = std::complex<double>(t.echoes[static_cast<std::size_t>(l * c.samples + k)]) / gain[static_cast<std::size_t>(k)];
      signal += std::norm(truth);
      error += std::norm(std::complex<double>(v.samples[static_cast<std::size_t>(k)]) - truth);
    }
  }
  const double snrDb = 10.0 * std::log10(signal / error);
  RecordProperty("fbaq_snr_db", std::to_string(snrDb));
  EXPECT_GT(snrDb, 18.0);
}

INSTANTIATE_TEST_SUITE_P(Faults, SimulatedExtraction,
                         ::testing::Values(Case{"clean", {}}, Case{"lost", {sim::Fault::kLostPackets}},
                                           Case{"swst_change", {sim::Fault::kSwstChange}}),
                         [](const auto& info) { return std::string(info.param.name); });

}  // namespace

// Parameters of the first packets and the IM timeline table, on simulated products whose truth
// is known, and on the real truncated products.
#include <gtest/gtest.h>

#include <cmath>
#include <filesystem>
#include <string>
#include <vector>

#include "base/errors.hpp"
#include "envisat/aux_products.hpp"
#include "envisat/fbaq.hpp"
#include "simulator/fbaq_encoder.hpp"
#include "envisat/table_builder.hpp"
#include "simulated_product.hpp"

using namespace sar::envisat;
using sar::test::simulated;
using sar::test::small_im_config;
namespace sim = sar::simulator;
namespace ec = sar::base::ec;

namespace {

const std::string kRealDir = std::string(SAR_REAL_DATA_DIR) + "/ASA_IM__0P_truncated/";

template <class F>
sar::base::CErrorExceptionManager raised(F&& f) {
  try {
    f();
  } catch (const sar::base::CErrorExceptionManager& e) {
    return e;
  }
  ADD_FAILURE() << "no error raised";
  return sar::base::CErrorExceptionManager(0, {}, "", 0);
}

}  // namespace

// Head faults near the start must not move the statistic: the bad slot stays empty.
class LoadParam : public ::testing::TestWithParam<std::vector<sim::Fault>> {};

TEST_P(LoadParam, GivesTheSimulatedAcquisition) {
  sim::SimulationConfig c = small_im_config("loadparam_" + std::to_string(GetParam().size()), GetParam());
  const sim::SimulationTruth& t = simulated(c);
  ASSERT_FALSE(t.ins_path.empty());
  std::vector<sarpar> ch(1);
  ASSERT_EQ(loadparam(t.level0_path, t.ins_path, kModeIM, ch), 0);
  const sarpar& p = ch[0];
  const double fs = c.im.sampling_frequency;
  EXPECT_EQ(p.samplingRate, fs);
  EXPECT_EQ(p.carrierFrequency, c.im.carrier_frequency);
  EXPECT_NEAR(p.range_gate_bias, c.im.range_gate_bias, 1e-15);
  EXPECT_DOUBLE_EQ(p.prf, t.prf);
  EXPECT_DOUBLE_EQ(p.pulse_length, t.pulse_length);
  EXPECT_EQ(p.chirp_band_code, c.im.bandwidth_code);
  EXPECT_NEAR(p.chirp_bandwidth, t.chirp_bandwidth, 1e-6);
  EXPECT_EQ(p.samples, c.samples);
  EXPECT_EQ(p.swl_code, c.samples);
  EXPECT_EQ(p.swst_code, t.swst_code);
  EXPECT_EQ(p.swath_rank, t.swath_rank);
  EXPECT_EQ(p.swath_number, c.im.beam_code);
  EXPECT_EQ(p.burst_echoes, 1023);  // IM echoes per cycle, from the real ASA_INS
  EXPECT_EQ(p.resampling_factor, 1);
}

INSTANTIATE_TEST_SUITE_P(Faults, LoadParam,
                         ::testing::Values(std::vector<sim::Fault>{},
                                           std::vector<sim::Fault>{sim::Fault::kCorruptHeader,
                                                                   sim::Fault::kWrongModeId}),
                         [](const auto& info) { return info.param.empty() ? "clean" : "head_faults"; });

TEST(ImTable, FollowsTheTimelineOfTheSimulatedProduct) {
  const sim::SimulationTruth& t = simulated(small_im_config("loadparam_0", {}));
  std::vector<sarpar> ch(1);
  LineTable table;
  ASSERT_EQ(init_IM_table(t.level0_path, table, ch, t.ins_path), 0);
  EXPECT_EQ(table.first_packet_counter, t.first_counter);
  EXPECT_EQ(table.last_packet_counter, t.last_counter);
  EXPECT_EQ(table.first_echo_counter, t.first_counter);  // the first packet is an echo
  EXPECT_NEAR(table.first_echo_time, t.first_line_time, 1e-6);
  EXPECT_NEAR(table.first_packet_time, t.first_line_time, 1e-6);
  EXPECT_NEAR(table.last_packet_time, t.first_line_time + (t.line_count - 1) / t.prf, 2e-6);
  EXPECT_DOUBLE_EQ(table.line_interval, 1.0 / t.prf);
  EXPECT_EQ(table.cycle_count, sar::test::expected_im_lines(t));
  ASSERT_EQ(table.entries.size(), static_cast<std::size_t>(t.line_count));
  ASSERT_EQ(t.calibration_lines, std::vector<int>{323});
  for (int l = 0; l < t.line_count; ++l) {
    const LineTableEntry& e = table.entries[static_cast<std::size_t>(l)];
    EXPECT_EQ(e.kind(), l == 323 ? kLinePeriodicCalibration : kLineEcho) << l;
    EXPECT_EQ((e.kind_word & kLineCycleStart) != 0, l == 324) << l;
  }
}

TEST(ImTable, TruncatedProductEndsAtItsLastWholePacket) {
  const sim::SimulationTruth& t = simulated(small_im_config("truncated", {sim::Fault::kTruncated}));
  ASSERT_GT(t.last_whole_line, 0);
  const PacketMark last = last_packet(t.level0_path, kModeIM);
  EXPECT_EQ(last.counter, t.first_counter + t.last_whole_line);
  EXPECT_TRUE(last.echo);
  const PacketMark first = first_packet(t.level0_path, kModeIM);
  EXPECT_EQ(first.counter, t.first_counter);
}

TEST(ImTable, BadProductsRaiseTheFileErrorNamingThem) {
  // The real products end inside their first packet: the head is read, no packet is whole.
  for (const char* name : {"ASA_IM__0CNPDE20120329_071134_000000163113_00121_52721_6279.N1",
                           "ASA_IM__0CNPDE20111031_071059_000000163108_00121_50566_4642.N1"}) {
    SCOPED_TRACE(name);
    const std::string path = kRealDir + name;
    EXPECT_GT(first_packet(path, kModeIM).counter, 0);
    const auto e = raised([&] { last_packet(path, kModeIM); });
    EXPECT_EQ(e.ec(), ec::kFileIo);
    ASSERT_GE(e.details().size(), 2u);
    EXPECT_EQ(e.details()[0], path);
    std::vector<sarpar> ch(1);
    LineTable table;
    const auto e2 = raised([&] { init_IM_table(path, table, ch, sar::test::kInsTemplate); });
    EXPECT_EQ(e2.ec(), ec::kFileIo);
    ASSERT_FALSE(e2.details().empty());
    EXPECT_EQ(e2.details()[0], path);
  }
  // An ASA_INS for a product: the product is no level 0 stream with clean heads.
  const auto e = raised([] { first_packet(sar::test::kInsTemplate, kModeIM); });
  EXPECT_EQ(e.ec(), ec::kFileIo);
  // Global monitoring has no timeline table.
  std::vector<sarpar> ch(5);
  LineTable table;
  const auto e3 = raised([&] { timeline_table_builder()("product.N1", sar::test::kInsTemplate, kModeGM, table, ch); });
  EXPECT_EQ(e3.ec(), ec::kBadArguments);
}

TEST(SimulatedAuxProducts, AreReadByTheIntakeAndCoverTheProduct) {
  const sim::SimulationTruth& t = simulated(small_im_config("loadparam_0", {}));
  const InsRecord ins = InsRecord::read(t.ins_path);
  const XcaRecord xca = XcaRecord::read(t.xca_path);
  for (const AuxProduct* a : {static_cast<const AuxProduct*>(&ins), static_cast<const AuxProduct*>(&xca)}) {
    SCOPED_TRACE(a->path());
    EXPECT_LE(a->validity_start(), t.first_line_time);
    EXPECT_GT(a->validity_stop(), t.first_line_time + t.line_count / t.prf);
    // The product name of the header is the file's name.
    EXPECT_EQ(a->header().product, std::filesystem::path(a->path()).filename().string());
  }
  // Both reconstruction tables are the simulator's, in the decoder's row order.
  const sim::FbaqTable& table = sim::simulator_fbaq_table();
  const FbaqLut i = ins.lut_i(), q = ins.lut_q();
  for (int row = 0; row < 16; ++row)
    for (int col = 0; col < 256; col += 17) {
      EXPECT_EQ(i(row, col), table.value[static_cast<std::size_t>(row)][static_cast<std::size_t>(col)]);
      EXPECT_EQ(q(row, col), i(row, col));
    }
  // The gain model is the one the echoes were made with.
  std::vector<float> gains(512);
  gain_table(ins, gains);
  const std::vector<double> model = sim::receive_gain(sim::ImParameters{}, 512);
  for (std::size_t k = 0; k < gains.size(); k += 37) EXPECT_NEAR(gains[k], model[k], 1e-5 * model[k]) << k;
  // What is not the simulation's stays the template's: the XCA pattern bytes.
  const XcaRecord real = XcaRecord::read(sar::test::kXcaTemplate);
  EXPECT_EQ(xca.elevation_gains(2, 0), real.elevation_gains(2, 0));
}

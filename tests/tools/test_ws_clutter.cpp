// Wide swath clutter of the simulator: the raw level of each sub-swath (the same at the same
// range in adjoining sub-swaths, falling as R^-3 across the swath, the asked power in the
// reference sub-swath), sub-swath windows placed to meet, and flat elevation patterns on demand.
#include <gtest/gtest.h>
#include <unistd.h>

#include <algorithm>
#include <cmath>
#include <filesystem>
#include <string>
#include <vector>

#include "envisat/aux_products.hpp"
#include "simulator/simulator.hpp"
#include "simulator/ws_clutter.hpp"

namespace sim = sar::simulator;
namespace fs = std::filesystem;

namespace {

const std::string kXcaTemplate = std::string(SAR_REAL_DATA_DIR) +
                                 "/ASA_XCA_AX/ASA_XCA_AXVIEC20101111_113830_20100601_000000_20141231_000000";

struct Level {
  double power = 0.0;  // mean |echo / gain|^2 over the columns
  double tau = 0.0;    // two-way time of their middle
};

// One WS product: SS1 and SS2 windows 200 samples apart (so that they share 312 of 512 samples),
// the others at their nominal incidences, clutter of 20 dB, no noise, the echoes kept.
class WsClutter : public ::testing::Test {
 protected:
  static void SetUpTestSuite() {
    sim::SimulationConfig c;
    c.mode = sim::AcquisitionMode::kWS;
    c.out_dir = (fs::temp_directory_path() / ("ws_clutter_" + std::to_string(::getpid()))).string();
    c.samples = 512;
    c.lines = 525 + 2 * 360;
    c.noise_db = -200.0;
    c.targets = {{{45.0, 10.0, 0.0}, 0.0}};
    c.clutter.power_db = 20.0;
    c.keep_echoes = true;
    c.ws.target_swath = 1;
    c.ws.flat_elevation = true;
    c.xca_template = kXcaTemplate;
    const auto adjoining = sim::ws_adjoining_incidences(c, 200);
    c.ws.swaths[0].incidence_deg = adjoining[0];
    config_ = new sim::SimulationConfig(c);
    truth_ = new sim::SimulationTruth(sim::run_simulation(c));
  }
  static void TearDownTestSuite() {
    std::error_code ec;
    fs::remove_all(config_->out_dir, ec);
    delete truth_;
    delete config_;
  }

  // Mean raw clutter power of sub-swath s over samples [k0, k1) of its echo lines.
  static Level level(int s, int k0, int k1) {
    const auto gain = sim::receive_gain(config_->im, config_->samples);
    double sum = 0.0;
    std::size_t n = 0;
    for (std::size_t l = 0; l < truth_->packets.size(); ++l) {
      const auto& p = truth_->packets[l];
      if (p.kind != sim::PacketKind::kEcho || p.channel != s) continue;
      for (int k = k0; k < k1; ++k, ++n)
        sum += std::norm(truth_->echoes[l * static_cast<std::size_t>(config_->samples) + static_cast<std::size_t>(k)]) /
               (gain[static_cast<std::size_t>(k)] * gain[static_cast<std::size_t>(k)]);
    }
    const auto& ch = truth_->channels[static_cast<std::size_t>(s)];
    return {sum / static_cast<double>(n), ch.near_range_time + 0.5 * (k0 + k1) / config_->im.sampling_frequency};
  }
  static sim::SimulationConfig* config_;
  static sim::SimulationTruth* truth_;
};
sim::SimulationConfig* WsClutter::config_ = nullptr;
sim::SimulationTruth* WsClutter::truth_ = nullptr;

TEST_F(WsClutter, RawLevelIsUniformInRadarBrightness) {
  ASSERT_TRUE(truth_->clutter.present);
  const double fs = config_->im.sampling_frequency;
  // The windows start 200 samples apart (within a sample: window starts are whole SWST codes).
  const double apart = (truth_->channels[1].near_range_time - truth_->channels[0].near_range_time) * fs;
  EXPECT_NEAR(apart, 200.0, 1.0);
  // The same range seen by SS1 and SS2, at their different PRFs and burst lengths: one level.
  const int shift = static_cast<int>(std::lround(apart));
  const Level a = level(0, shift + 40, 472), b = level(1, 40, 472 - shift);
  EXPECT_NEAR(10.0 * std::log10(b.power / a.power), 0.0, 0.1);
  RecordProperty("ss2_over_ss1_db", std::to_string(10.0 * std::log10(b.power / a.power)));
  // The asked power at the middle of the reference sub-swath (SS2).
  EXPECT_NEAR(10.0 * std::log10(level(1, 192, 320).power), config_->clutter.power_db, 0.1);
  // Across the swath the level falls as R^-3: SS2 against SS5, some 140 km further.
  const Level near = level(1, 40, 472), far = level(4, 40, 472);
  const double expected = 30.0 * std::log10(near.tau / far.tau);
  EXPECT_LT(expected, -1.5);
  EXPECT_NEAR(10.0 * std::log10(far.power / near.power), expected, 0.1);
  RecordProperty("ss5_over_ss2_db", std::to_string(10.0 * std::log10(far.power / near.power)) + " against " +
                                        std::to_string(expected));
}

// The written ASA_XCA has flat elevation patterns; the template keeps its own.
TEST(WsElevation, FlatPatternsOnDemand) {
  sim::SimulationConfig c;
  c.mode = sim::AcquisitionMode::kWS;
  c.out_dir = (fs::temp_directory_path() / ("ws_flat_" + std::to_string(::getpid()))).string();
  c.samples = 256;
  c.lines = 600;
  c.targets = {{{45.0, 10.0, 0.0}, 10.0}};
  c.ws.flat_elevation = true;
  c.xca_template = kXcaTemplate;
  const auto truth = sim::run_simulation(c);
  const auto written = sar::envisat::XcaRecord::read(truth.xca_path);
  const auto original = sar::envisat::XcaRecord::read(kXcaTemplate);
  double spread = 0.0;
  for (int beam = 1; beam <= 7; ++beam)
    for (int pol = 0; pol < 2; ++pol) {
      for (float g : written.elevation_gains(beam, pol)) EXPECT_EQ(g, 0.0f) << beam << " " << pol;
      const auto o = original.elevation_gains(beam, pol);
      spread = std::max(spread, static_cast<double>(*std::max_element(o.begin(), o.end()) - *std::min_element(o.begin(), o.end())));
    }
  EXPECT_GT(spread, 3.0);
  std::error_code ec;
  fs::remove_all(c.out_dir, ec);
}

}  // namespace

// Truth file of a simulated product: profile syntax, keys and values that agree with the product.
#include <gtest/gtest.h>

#include <filesystem>
#include <fstream>
#include <map>
#include <string>

#include "base/convert.hpp"
#include "simulator/simulator.hpp"

namespace sim = sar::simulator;

namespace {

// section -> key -> value, by the profile rules: lines before the first section are skipped.
std::map<std::string, std::map<std::string, std::string>> read_profile(const std::string& path) {
  std::map<std::string, std::map<std::string, std::string>> out;
  std::ifstream in(path);
  std::string line, section;
  while (std::getline(in, line)) {
    if (!line.empty() && line[0] == '[') {
      section = line.substr(1, line.find(']') - 1);
      out[section];
      continue;
    }
    const std::size_t eq = line.find(" = ");
    if (section.empty() || eq == std::string::npos) continue;
    out[section][line.substr(0, eq)] = line.substr(eq + 3);
  }
  return out;
}

}  // namespace

TEST(TruthFile, HoldsTheAcquisitionTargetsAndFaults) {
  sim::SimulationConfig c;
  c.out_dir = std::string(SAR_BINARY_DIR) + "/test_tools_truth";
  std::filesystem::remove_all(c.out_dir);
  c.lines = 200;
  c.samples = 256;
  c.targets = {{{45.0, 10.0, 0.0}, 30.0}, {{45.001, 10.004, 50.0}, 12.0}};
  c.faults = {sim::Fault::kLostPackets, sim::Fault::kSwstChange};
  const sim::SimulationTruth t = sim::run_simulation(c);
  auto p = read_profile(t.truth_path);

  EXPECT_EQ(p["product"]["level0_file"], t.level0_path);
  EXPECT_EQ(p["product"]["orbit_file"], t.orbit_path);
  EXPECT_EQ(p["acquisition"]["line_count"], "200");
  EXPECT_NEAR(sar::base::ascii2sec85(p["acquisition"]["first_line_time"]), t.first_line_time, 1e-6);
  EXPECT_NEAR(std::stod(p["acquisition"]["prf"]), 19207680.0 / 11624.0, 1e-6);
  EXPECT_EQ(std::stoi(p["acquisition"]["swst_code"]), t.swst_code);
  EXPECT_NEAR(std::stod(p["acquisition"]["near_range_time"]), t.near_range_time, 1e-15);
  ASSERT_EQ(p.count("target_2"), 1u);
  EXPECT_EQ(p.count("target_3"), 0u);
  for (int i = 0; i < 2; ++i) {
    auto& s = p["target_" + std::to_string(i + 1)];
    const sim::TargetTruth& tt = t.targets[static_cast<std::size_t>(i)];
    EXPECT_NEAR(std::stod(s["zero_doppler_time_sec85"]), tt.zero_doppler_time, 1e-6);
    EXPECT_NEAR(std::stod(s["slant_range"]), tt.slant_range, 1e-3);
    // The fractional positions agree with the times.
    EXPECT_NEAR(std::stod(s["azimuth_line"]), (tt.zero_doppler_time - t.first_line_time) * t.prf, 1e-3);
    EXPECT_NEAR(std::stod(s["range_sample"]), (2.0 * tt.slant_range / sim::kSpeedOfLight - t.near_range_time) * 19207680.0, 1e-3);
  }
  EXPECT_EQ(p["faults"]["faults"], "{\"lost\" \"swst-change\"}");
  EXPECT_EQ(p["faults"]["lost_lines"], "{66 67 68 69 70}");
  EXPECT_EQ(p["faults"]["swst_change_line"], "133");
  EXPECT_EQ(p["faults"]["truncated_at_byte"], "-1");
}

#pragma once
// Small simulated IM products with their ASA_INS and ASA_XCA, made once per test binary and
// configuration, for the intake tests that compare what is read with the simulator's truth.
#include <unistd.h>

#include <filesystem>
#include <map>
#include <string>
#include <vector>

#include "simulator/simulator.hpp"

namespace sar::test {

inline const std::string kInsTemplate = std::string(SAR_REAL_DATA_DIR) +
                                        "/ASA_INS_AX/ASA_INS_AXVIEC20101222_143805_20101022_000000_20141231_235959";
inline const std::string kXcaTemplate = std::string(SAR_REAL_DATA_DIR) +
                                        "/ASA_XCA_AX/ASA_XCA_AXVIEC20101111_113830_20100601_000000_20141231_000000";

/// 400 lines of 500 samples (a short FBAQ block closes each line); the first packet lies at
/// cycle position 700, so the product crosses one cycle boundary, with its calibration pulse
/// at line 323.
inline simulator::SimulationConfig small_im_config(const std::string& tag, std::vector<simulator::Fault> faults) {
  simulator::SimulationConfig c;
  // One folder per process: CTest runs the cases of a binary side by side.
  c.out_dir = std::string(SAR_BINARY_DIR) + "/sim_" + tag + "_" + std::to_string(::getpid());
  c.lines = 400;
  c.samples = 500;
  c.targets = {{{45.0, 10.0, 0.0}, 30.0}};
  c.faults = std::move(faults);
  c.ins_template = kInsTemplate;
  c.xca_template = kXcaTemplate;
  c.keep_echoes = true;
  return c;
}

/// The product of a configuration, simulated on first use (keyed by output folder); the folders
/// are removed when the process ends.
inline const simulator::SimulationTruth& simulated(const simulator::SimulationConfig& c) {
  struct Made : std::map<std::string, simulator::SimulationTruth> {
    ~Made() {
      std::error_code err;
      for (const auto& entry : *this) std::filesystem::remove_all(entry.first, err);
    }
  };
  static Made made;
  auto it = made.find(c.out_dir);
  if (it == made.end()) {
    std::filesystem::remove_all(c.out_dir);
    it = made.emplace(c.out_dir, simulator::run_simulation(c)).first;
  }
  return it->second;
}

/// Lines an IM extraction gives: the timeline counts echo lines between the first echo and the
/// last packet, so the last packet and one line per cycle boundary crossed are left out.
inline int expected_im_lines(const simulator::SimulationTruth& t) {
  int crossed = 0;
  for (int l : t.calibration_lines)
    if (l < t.line_count - 1) ++crossed;
  return t.line_count - 1 - crossed;
}

}  // namespace sar::test

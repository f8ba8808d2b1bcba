#pragma once
// Simulated wide swath products for the burst chain's tests, and the steps before the chain:
// extraction into a work folder, the orbit over the scene and the nominal replica.
#include <gtest/gtest.h>

#include <array>
#include <filesystem>
#include <string>
#include <vector>

#include "envisat/extract.hpp"
#include "envisat/replica_pattern.hpp"
#include "envisat/table_builder.hpp"
#include "scansar/wide_swath.hpp"
#include "simulated_product.hpp"

namespace sar::test {

/// A wide swath product of `cycles` whole burst cycles after the acquisition's 525 initial
/// packets, with `samples` a line and a point target in the middle of every sub-swath.
/// With `perSwath` above 1, each sub-swath holds that many targets spread over one burst cycle
/// along the track, so that together they see every part of the azimuth pattern alike.
inline simulator::SimulationConfig ws_product(const std::string& tag, std::array<int, 5> order, int cycles,
                                               int samples, int perSwath = 1) {
  simulator::SimulationConfig c = small_im_config("scansar_" + tag, {});
  c.mode = simulator::AcquisitionMode::kWS;
  c.samples = samples;
  c.keep_echoes = false;
  c.ws.order = order;
  c.lines = 525 + cycles * 360;
  c.noise_db = 0.0;
  c.targets = {{{45.0, 10.0, 0.0}, 30.0}};
  for (int s : {0, 1, 3, 4}) c.targets.push_back({simulator::ws_swath_target(c, s, 0.0), 30.0});
  for (int k = 1; k < perSwath; ++k)
    for (int s = 0; s < 5; ++s) c.targets.push_back({simulator::ws_swath_target(c, s, 0.19 * k / perSwath), 30.0});
  return c;
}

/// Target of the product in sub-swath s (the first target lies in SS3).
inline int target_of_swath(int s) {
  constexpr int kTarget[5] = {1, 2, 0, 3, 4};
  return kTarget[s];
}

/// What the job hands the processor: the five extracted channels and the scene's references.
struct WsInputs {
  std::string dir;
  std::vector<envisat::sarpar> channels;
  metadata::SceneReferences refs;
  envisat::extconf conf;
};

inline void prepare(const simulator::SimulationTruth& t, const std::string& dir, WsInputs& x) {
  x.dir = dir;
  std::filesystem::create_directories(dir);
  x.channels.assign(5, envisat::sarpar{});
  for (int s = 0; s < 5; ++s) {
    x.channels[static_cast<std::size_t>(s)].outputDir = dir;
    x.channels[static_cast<std::size_t>(s)].raw_file = dir + "/SS" + std::to_string(s + 1);
  }
  ASSERT_EQ(envisat::envi_extract(t.level0_path, t.ins_path, "", x.channels, x.conf, envisat::timeline_table_builder()), 0);
  envisat::sarpar whole = x.channels[0];
  scansar::scansar scan;
  ASSERT_EQ(scansar::derive_geometry(x.channels, scan), 0);
  whole.lines = static_cast<int>(scan.bursts * scan.cycleTime * whole.prf);
  ASSERT_EQ(envisat::envi_orbit(t.orbit_path, whole, x.refs), 0);
  ASSERT_EQ(metadata::synthetic_chirp(x.channels[0], x.refs), 0);
}

}  // namespace sar::test

// The IM job gives the same SLC bytes whatever the number of threads: range blocks, Doppler
// blocks and azimuth sub-blocks are shared among threads, never summed in thread order.
#include <gtest/gtest.h>

#include <regex>

#include "job_harness.hpp"
#include "simulator/simulator.hpp"

using namespace sar::test;
namespace sim = sar::simulator;

TEST(ImJobThreads, SlcBytesDoNotDependOnTheThreadCount) {
  ScratchJob inputs("threads_inputs");
  sim::SimulationConfig c;
  c.out_dir = (inputs.dir() / "in").string();
  c.lines = 3000;
  c.samples = 1200;
  c.noise_db = 0.0;
  c.clutter.power_db = 25.0;  // the centroid comes from the data, through the parallel estimator
  c.targets = {{{45.0, 10.0, 0.0}, 40.0}};
  c.ins_template = kInsTemplate;
  c.xca_template = kXcaTemplate;
  const sim::SimulationTruth t = sim::run_simulation(c);

  std::string slc[2];
  for (int threads : {1, 2}) {
    SCOPED_TRACE(threads);
    ScratchJob job("threads_" + std::to_string(threads));
    const std::string root = (job.dir() / "out").string();
    const std::string list = job.layout({t.level0_path, t.orbit_path, t.ins_path, t.xca_path, root, "128", "128",
                                         "NotOK", "NotOK", "NotOK", "NotOK", "NotOK", "NotOK", "1.0"});
    set_parameters(job.dir() / "des" / "parameters_IM.hdr",
                   {{"LinesInBlock", "2048"}, {"SamplesInBlock", "512"}, {"RangeOverlap", "128"}});
    const RunResult r = job.run("main_focussing_asar_IM#" + list, "OMP_NUM_THREADS=" + std::to_string(threads));
    ASSERT_EQ(r.status, 0) << r.err << job.log();
    EXPECT_NE(job.log().find("Doppler centroid at the scene centre"), std::string::npos);
    EXPECT_EQ(job.log().find("geometric centroid is used"), std::string::npos) << job.log();
    slc[threads - 1] = slurp(root + "_slc");
  }
  ASSERT_FALSE(slc[0].empty());
  EXPECT_TRUE(slc[0] == slc[1]) << "the SLC differs between one and two threads";
}

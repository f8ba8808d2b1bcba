// The IM job on a simulated product narrower than one chirp, through the focussing executable:
// extraction, orbit, pattern and replica run for real, and range compression refuses a line
// shorter than the pulse with the stage-failure code and a text saying why, keeping the work
// files for inspection.
#include <gtest/gtest.h>

#include "base/convert.hpp"
#include "job_harness.hpp"
#include "simulator/simulator.hpp"

using namespace sar::test;
namespace sim = sar::simulator;

TEST(ImJobOnSimulatedProduct, ProductNarrowerThanThePulseIsRefusedAfterExtraction) {
  ScratchJob job("im_simulated");
  sim::SimulationConfig c;
  c.out_dir = (job.dir() / "inputs").string();
  c.lines = 400;
  c.samples = 400;
  c.targets = {{{45.0, 10.0, 0.0}, 30.0}};
  c.ins_template = kInsTemplate;
  c.xca_template = kXcaTemplate;
  const sim::SimulationTruth t = sim::run_simulation(c);
  ASSERT_FALSE(t.ins_path.empty());
  ASSERT_FALSE(t.xca_path.empty());

  const std::string list = job.layout({t.level0_path, t.orbit_path, t.ins_path, t.xca_path});
  const RunResult r = job.run("main_focussing_asar_IM#" + list);

  EXPECT_EQ(job.error_code(), 130560) << r.err;
  EXPECT_EQ(r.status, 2) << r.err;
  const auto record = job.error_lines();
  ASSERT_GE(record.size(), 5u) << job.log();
  EXPECT_EQ(record[3], "IMprocessor()");
  // Orbit, pattern and replica stand; the range buffer refuses 400 samples for a pulse of
  // more than 500.
  EXPECT_EQ(record[4], "init_buffer");
  EXPECT_NE(job.log().find("is longer than a raw line (400 samples)"), std::string::npos) << job.log();
  for (const auto& e : fs::recursive_directory_iterator(job.dir()))
    EXPECT_EQ(e.path().filename().string().find("_slc"), std::string::npos) << e.path();

  // With the scene in memory (the shipped Flag_incore 1) the extracted lines never reach a file,
  // so a failed run leaves no line file. The timeline leaves out the last packet and, at
  // position 700 of a cycle, one line for the boundary.
  ASSERT_EQ(t.calibration_lines.size(), 1u);
  const int lines = t.line_count - 2;
  EXPECT_FALSE(fs::exists(job.dir() / "EXTR")) << job.log();

  // The stage states what it extracted: lines, samples and the first line's time.
  std::string first;
  ASSERT_EQ(sar::base::sec852myascii(t.first_line_time, first), 0);
  const std::string log = job.log();
  EXPECT_NE(log.find("EXTR: " + std::to_string(lines) + " lines of " + std::to_string(c.samples) +
                     " samples from " + first.substr(0, 27)),
            std::string::npos)
      << log;
}

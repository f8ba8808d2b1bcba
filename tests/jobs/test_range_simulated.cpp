// Range compression of a simulated IM product through the job's own stages (extraction,
// orbit, replica, range compression): each target's compressed echo at its zero-Doppler line
// peaks at the slant range the simulator put it at, with the width and sidelobes of an
// unweighted band of the chirp's bandwidth. File and core mode agree, also across a change of
// the sampling window.
#include <gtest/gtest.h>

#include <cmath>
#include <cstdio>
#include <cstring>
#include <filesystem>
#include <fstream>

#include "analyser/irf.hpp"
#include "job_harness.hpp"
#include "jobs/stages.hpp"
#include "simulator/simulator.hpp"

using namespace sar::test;
namespace sim = sar::simulator;

namespace {

struct Compressed {
  sar::jobs::sarpar par;
  sar::jobs::procparm proc;
  std::vector<std::complex<float>> data;  // lines x rangeSamples
};

Compressed compress(const sim::SimulationTruth& t, const fs::path& dir, bool core) {
  Compressed c;
  fs::create_directories(dir);
  c.par.outputDir = dir.string();
  c.par.extrPath = (dir / "EXTR").string();
  c.par.rgfPath = (dir / "EXTR.rgf").string();
  sar::jobs::enviauxfiles files;
  files.level0 = t.level0_path;
  files.ins = t.ins_path;
  files.xca = t.xca_path;
  files.orbit = t.orbit_path;
  sar::jobs::extconf extra;
  std::vector<sar::metadata::sarpar> channels{c.par};
  EXPECT_EQ(sar::jobs::envi_extract(files, channels, extra), 0);
  c.par = channels.front();
  EXPECT_EQ(sar::jobs::envi_orbit(files.orbit, c.par, c.proc), 0);
  EXPECT_EQ(sar::jobs::envi_syntchirp(c.par, c.proc), 0);
  c.proc.Flag_swstal = 1;
  c.proc.Flag_incore = core ? 1 : 0;
  c.proc.Azblk = 300;
  if (core) {
    EXPECT_EQ(sar::jobs::init_buffer(c.par, c.proc), 0);
  }
  EXPECT_EQ(sar::jobs::rangefoc(c.par, c.proc), 0);
  if (core) {
    c.data.assign(c.proc.matrix.begin(), c.proc.matrix.end());
  } else {
    c.data.resize(fs::file_size(c.par.rgfPath) / 8);
    std::ifstream in(c.par.rgfPath, std::ios::binary);
    in.read(reinterpret_cast<char*>(c.data.data()), static_cast<std::streamsize>(c.data.size() * 8));
  }
  return c;
}

sim::SimulationConfig scene(const fs::path& dir, bool swstChange) {
  sim::SimulationConfig c;
  c.out_dir = dir.string();
  c.lines = 1400;
  c.samples = 1200;
  c.noise_db = -200.0;
  c.targets = {{{45.0, 10.0, 0.0}, 30.0}, {{45.004, 10.030, 0.0}, 20.0}};
  if (swstChange) c.faults = {sim::Fault::kSwstChange};
  c.ins_template = kInsTemplate;
  c.xca_template = kXcaTemplate;
  return c;
}

}  // namespace

TEST(RangeCompressionOfSimulatedTargets, PeaksAtTrueRangeWithTheBandsResolution) {
  for (const bool swstChange : {false, true}) {
    SCOPED_TRACE(swstChange ? "with a window change" : "steady window");
    ScratchJob job(swstChange ? "rangefoc_swst" : "rangefoc_steady");
    const sim::SimulationTruth t = sim::run_simulation(scene(job.dir() / "inputs", swstChange));
    const Compressed file = compress(t, job.dir() / "file", false);
    const Compressed core = compress(t, job.dir() / "core", true);
    ASSERT_EQ(file.data.size(), core.data.size());
    EXPECT_EQ(0, std::memcmp(file.data.data(), core.data.data(), file.data.size() * 8));

    const int width = file.proc.rangeSamples;
    const double theory = 0.886 * file.par.samplingRate / t.chirp_bandwidth;
    for (const auto& target : t.targets) {
      const double line = (target.zero_doppler_time - file.par.azimuthStartTime) * file.par.prf;
      const auto l = static_cast<std::size_t>(std::lround(line));
      ASSERT_LT(l, static_cast<std::size_t>(file.par.lines));
      const double expected = (target.range_time - file.par.nearRangeTime) * file.par.samplingRate;
      const std::span<const std::complex<float>> cut(file.data.data() + l * width, static_cast<std::size_t>(width));
      const auto m = sar::analyser::measure_cut(cut, expected, 16);
      ASSERT_TRUE(m.valid) << m.problem;
      // Within a line the target moves by its range walk over half a line at most.
      std::printf("range IRF: line %.1f expected %.3f peak %.3f width %.4f (theory %.4f) PSLR %.2f ISLR %.2f\n", line,
                  expected, m.peak, m.resolution, theory, m.pslr_db, m.islr_db);
      EXPECT_NEAR(m.peak, expected, 0.05) << "target at line " << line;
      EXPECT_NEAR(m.resolution, theory, 0.05 * theory);
      EXPECT_NEAR(m.pslr_db, -13.26, 1.0);
    }
  }
}

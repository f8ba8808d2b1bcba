// sarfocus wraps focussing and adds nothing to the processing: on the same product and
// parameters it leaves the same SLC, byte for byte, as focussing run on a job list made by hand
// (or, while the IM chain still stops at a stage, the same error record).
#include <gtest/gtest.h>

#include <complex>
#include <cstring>
#include <regex>

#include "test_standalone_support.hpp"

using namespace sar::test;
using namespace sar::jobs;

TEST(SarfocusAgainstFocussing, SameProductSameBytes) {
  ScratchJob job("sarfocus_same");
  const auto t = simulate_small(job.dir() / "in", "14-MAR-2008 10:00:00.000000");

  // By hand: the host's layout, a list of the job's fourteen arguments, the parameters edited.
  const fs::path hand = job.dir() / "hand";
  const std::string root = (hand / "scene").string();
  job.layout({});
  const std::string list =
      job.write_list("hand.txt", {"IM job by hand", t.level0_path, t.orbit_path, t.ins_path, t.xca_path, root, "128",
                                  "128", "NotOK", "NotOK", "NotOK", "NotOK", "NotOK", "OK", "1.0", "#"});
  fs::create_directories(hand);
  const fs::path params = job.dir() / "des" / "parameters_IM.hdr";
  std::string text = slurp(params);
  for (const auto& p : kSmallSceneParams) {
    const std::string key = p.substr(0, p.find('='));
    const std::regex line("(^|\n)" + key + " = [^\n]*");
    ASSERT_TRUE(std::regex_search(text, line)) << key;
    text = std::regex_replace(text, line, "$1" + key + " = " + p.substr(p.find('=') + 1));
  }
  std::ofstream(params, std::ios::binary) << text;
  const RunResult byHand = job.run("main_focussing_asar_IM#" + list);

  // sarfocus: the orbit and auxiliary products found in the simulator's folder.
  std::vector<std::string> args = {"im",    t.level0_path, "--orbit", (job.dir() / "in").string(), "--aux",
                                   (job.dir() / "in").string(), "--out", (job.dir() / "out").string(),
                                   "--quicklook", "128x128"};
  for (const auto& p : kSmallSceneParams) {
    args.push_back("--param");
    args.push_back(p);
  }
  const CliResult wrapped = sarfocus(args);
  const std::string stem = product_stem(t.level0_path);
  const fs::path slc = job.dir() / "out" / (stem + "_slc");
  const fs::path work = job.dir() / "out" / ".sarfocus" / stem;

  ASSERT_EQ(fs::exists(root + "_slc"), fs::exists(slc)) << byHand.err << "\n" << wrapped.err;
  if (!fs::exists(slc)) {
    // Both stop at the same stage with the same record.
    EXPECT_EQ(wrapped.status, byHand.status);
    EXPECT_EQ(lines_of(work / "Vanterra.working_error"), job.error_lines());
    return;
  }
  EXPECT_EQ(byHand.status, 0) << byHand.err;
  EXPECT_EQ(wrapped.status, 0) << wrapped.err;
  const std::string mine = slurp(slc), theirs = slurp(root + "_slc");
  ASSERT_GT(mine.size(), 0u);
  ASSERT_EQ(mine.size(), theirs.size());
  if (mine == theirs) return;

  // The bytes differ. That is sarfocus's fault unless focussing does not repeat its own bytes
  // either (FFT plans chosen by measurement change the rounding from run to run).
  std::ofstream(job.dir() / "Vanterra.working") << "0\n-\n";  // a finished run took it away
  const RunResult repeat = job.run("main_focussing_asar_IM#" + list);
  ASSERT_EQ(repeat.status, 0) << repeat.err;
  ASSERT_NE(slurp(root + "_slc"), theirs) << "focussing repeats its bytes but sarfocus's SLC differs";
  std::vector<std::complex<float>> a(mine.size() / 8), b(a.size());
  std::memcpy(a.data(), mine.data(), a.size() * 8);
  std::memcpy(b.data(), theirs.data(), b.size() * 8);
  float peak = 0.0f, worst = 0.0f;
  for (std::size_t i = 0; i < a.size(); ++i) {
    peak = std::max(peak, std::abs(b[i]));
    worst = std::max(worst, std::abs(a[i] - b[i]));
  }
  EXPECT_LE(worst, 1e-5f * peak) << "beyond the rounding of a different FFT plan";
  std::printf("note: focussing does not repeat its own SLC bytes; sarfocus's SLC matches to %.2g of the peak\n",
              static_cast<double>(worst / peak));
}

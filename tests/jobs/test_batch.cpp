// sarfocus batch on three small simulated IM products, one of them cut short: run two at a
// time, run again, and the same products as a Slurm array job and a GNU parallel command.
#include <gtest/gtest.h>

#include <memory>

#include "jobs/batch.hpp"
#include "test_standalone_support.hpp"

using namespace sar::test;
using namespace sar::jobs;

namespace {

class Batch : public ::testing::Test {
 protected:
  static void SetUpTestSuite() {
    job_ = std::make_unique<ScratchJob>("batch");
    in_ = job_->dir() / "in";
    // Four days apart, so that each orbit file covers its own product only.
    for (const char* day : {"02-MAR-2008 10:00:00.000000", "06-MAR-2008 10:00:00.000000",
                            "10-MAR-2008 10:00:00.000000"})
      products_.push_back(simulate_small(in_, day).level0_path);
    fs::resize_file(products_[2], 20000);
    // Paths relative to the list's folder, a comment and a blank line.
    list_ = (job_->dir() / "products.txt").string();
    std::ofstream list(list_);
    list << "# three products\n\n";
    for (const auto& p : products_) list << "in/" << fs::path(p).filename().string() << "\n";
  }
  static void TearDownTestSuite() {
    job_.reset();
    products_.clear();
  }

  static std::vector<std::string> args(const std::string& source, const fs::path& out,
                                       std::vector<std::string> extra = {}) {
    std::vector<std::string> a = {"batch",       source, "--orbit", in_.string(),         "--aux",
                                  in_.string(), "--out", out.string(), "--quicklook", "128x128"};
    for (const auto& p : kSmallSceneParams) {
      a.push_back("--param");
      a.push_back(p);
    }
    a.insert(a.end(), extra.begin(), extra.end());
    return a;
  }

  static std::vector<std::string> rows_of(const std::string& table) {
    std::vector<std::string> rows;
    std::istringstream in(table);
    for (std::string l; std::getline(in, l);) rows.push_back(l);
    return rows;
  }

  static inline std::unique_ptr<ScratchJob> job_;
  static inline fs::path in_;
  static inline std::vector<std::string> products_;
  static inline std::string list_;
};

}  // namespace

TEST_F(Batch, RunsTwoAtATimeReportsTheFailureAndSkipsCompleteOnesAfterwards) {
  const fs::path out = job_->dir() / "out";
  const CliResult first = sarfocus(args(list_, out, {"--jobs", "2"}));
  EXPECT_EQ(first.status, 1) << first.out << first.err;
  const auto rows = rows_of(first.out);
  ASSERT_EQ(rows.size(), 5u) << first.out;
  for (std::size_t i = 0; i < 2; ++i) {
    const std::string name = fs::path(products_[i]).filename().string();
    ASSERT_EQ(rows[i + 1].find(name), 0u) << rows[i + 1];
    if (rows[i + 1].find(" done ") != std::string::npos) {
      EXPECT_TRUE(fs::exists(out / (product_stem(name) + "_slc")));
      EXPECT_TRUE(fs::exists(out / (product_stem(name) + "_slc.tif")));
    } else {
      // The IM chain still stops early: the batch must stop where a single run stops.
      StandaloneRequest single;
      single.product = products_[i];
      single.orbit = single.auxDir = in_.string();
      single.outDir = (job_->dir() / "single").string();
      single.params = kSmallSceneParams;
      const StandaloneOutcome o = run_standalone(single, SAR_FOCUSSING_EXE, nullptr);
      EXPECT_NE(rows[i + 1].find(o.error), std::string::npos) << rows[i + 1] << "\n" << o.error;
    }
  }
  EXPECT_NE(rows[3].find(" FAILED "), std::string::npos) << rows[3];
  EXPECT_NE(rows[3].find("[EC : "), std::string::npos) << rows[3];
  EXPECT_NE(rows[4].find("1 failed"), std::string::npos);
  const std::string failedStem = product_stem(products_[2]);
  EXPECT_FALSE(fs::exists(out / (failedStem + "_slc")));
  EXPECT_TRUE(fs::exists(out / ".sarfocus" / failedStem / "Vanterra.log"));

  // Again: the complete products are skipped, the failed one runs and fails again.
  std::vector<fs::file_time_type> stamps;
  for (std::size_t i = 0; i < 2; ++i) {
    const fs::path slc = out / (product_stem(products_[i]) + "_slc");
    stamps.push_back(fs::exists(slc) ? fs::last_write_time(slc) : fs::file_time_type{});
  }
  const CliResult second = sarfocus(args(list_, out, {"--jobs", "2"}));
  EXPECT_EQ(second.status, 1);
  const auto again = rows_of(second.out);
  ASSERT_EQ(again.size(), 5u);
  for (std::size_t i = 0; i < 2; ++i) {
    const bool wasDone = rows[i + 1].find(" done ") != std::string::npos;
    EXPECT_EQ(again[i + 1].find(" skipped ") != std::string::npos, wasDone) << again[i + 1];
    if (wasDone) {
      EXPECT_EQ(fs::last_write_time(out / (product_stem(products_[i]) + "_slc")), stamps[i]);
    }
  }
  EXPECT_NE(again[3].find(" FAILED "), std::string::npos);
}

TEST_F(Batch, SlurmScriptHasATaskPerProductThatRunsSarfocus) {
  const fs::path out = job_->dir() / "slurm out";
  const CliResult emitted = sarfocus(args(list_, out, {"--emit", "slurm", "--jobs", "2", "--slurm-option",
                                                       "--time=00:10:00"}));
  ASSERT_EQ(emitted.status, 0) << emitted.err;
  const fs::path script = job_->dir() / "focus.sbatch";
  std::ofstream(script) << emitted.out;
  EXPECT_EQ(shell("bash -n '" + script.string() + "' 2>&1").status, 0);
  EXPECT_NE(emitted.out.find("#SBATCH --array=0-2%2\n"), std::string::npos) << emitted.out;
  EXPECT_NE(emitted.out.find("#SBATCH --time=00:10:00\n"), std::string::npos);
  for (std::size_t i = 0; i < products_.size(); ++i)
    EXPECT_NE(emitted.out.find("  " + std::to_string(i) + ") product=" + shell_quote(products_[i]) + " ;;\n"),
              std::string::npos)
        << emitted.out;
  EXPECT_TRUE(fs::is_directory(out / ".sarfocus"));  // for the task logs

  // A task run by hand as Slurm would run it: the corrupt product, then an index beyond the list.
  if (!fs::exists(sarfocus_tools().sarfocus)) GTEST_SKIP() << "sarfocus is not built beside focussing";
  const std::string run = "cd '" + job_->dir().string() + "' && SLURM_ARRAY_TASK_ID=";
  const CliResult corrupt = shell(run + "2 bash '" + script.string() + "' 2>&1");
  EXPECT_NE(corrupt.status, 0);
  EXPECT_NE(corrupt.out.find(".sarfocus/" + product_stem(products_[2]) + "/Vanterra.log"), std::string::npos)
      << corrupt.out;
  const CliResult beyond = shell(run + "7 bash '" + script.string() + "' 2>&1");
  EXPECT_EQ(beyond.status, 2);
  EXPECT_NE(beyond.out.find("no product for array task 7"), std::string::npos);
}

TEST_F(Batch, GnuParallelCommandRunsHere) {
  const fs::path out = job_->dir() / "parallel";
  const CliResult emitted = sarfocus(args(list_, out, {"--emit", "parallel", "--jobs", "2"}));
  ASSERT_EQ(emitted.status, 0) << emitted.err;
  EXPECT_EQ(emitted.out.rfind("parallel -q --will-cite --jobs 2 ", 0), 0u) << emitted.out;
  EXPECT_NE(emitted.out.find(" im {} --orbit "), std::string::npos);
  for (const auto& p : products_) EXPECT_NE(emitted.out.find(shell_quote(p)), std::string::npos) << p;
  if (shell("command -v parallel").status != 0) GTEST_SKIP() << "GNU parallel is not installed";
  if (!fs::exists(sarfocus_tools().sarfocus)) GTEST_SKIP() << "sarfocus is not built beside focussing";

  const CliResult ran = shell(emitted.out.substr(0, emitted.out.size() - 1) + " 2>&1");
  EXPECT_EQ(ran.status, 1) << ran.out;  // GNU parallel counts the failed jobs
  EXPECT_FALSE(fs::exists(out / (product_stem(products_[2]) + "_slc")));
  // The good ones come out as a local batch makes them.
  for (std::size_t i = 0; i < 2; ++i) {
    const std::string slc = product_stem(products_[i]) + "_slc";
    if (fs::exists(job_->dir() / "out" / slc)) {
      EXPECT_TRUE(slurp(out / slc) == slurp(job_->dir() / "out" / slc)) << slc;
    }
  }
}

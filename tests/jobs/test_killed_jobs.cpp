// A job killed in each of its stages: SIGTERM lets it write an error record that says so and
// remove its partial files; SIGKILL gives it no chance, and sarfocus says what happened. Either
// way no file that looks like a finished product is left, in the output folder or the job's.
#include <gtest/gtest.h>
#include <signal.h>

#include <chrono>
#include <future>
#include <thread>

#include "test_standalone_support.hpp"

using namespace sar::test;

namespace {

// The running focussing child of this process, 0 when there is none.
pid_t focussing_child() {
  const std::string parent = std::to_string(::getpid());
  for (const auto& e : fs::directory_iterator("/proc")) {
    const std::string stat = slurp(e.path() / "stat");
    const auto close = stat.rfind(')');
    if (close == std::string::npos || stat.find("(focussing)") == std::string::npos) continue;
    std::istringstream rest(stat.substr(close + 2));
    std::string state, ppid;
    rest >> state >> ppid;
    if (ppid == parent && state != "Z") return static_cast<pid_t>(std::stol(e.path().filename().string()));
  }
  return 0;
}

class KilledJob : public ::testing::Test {
 protected:
  static void SetUpTestSuite() {
    job_ = std::make_unique<ScratchJob>("killed");
    in_ = job_->dir() / "in";
    product_ = simulate_small(in_, "02-MAR-2008 10:00:00.000000").level0_path;
  }
  static void TearDownTestSuite() { job_.reset(); }
  static inline std::unique_ptr<ScratchJob> job_;
  static inline fs::path in_;
  static inline std::string product_;
};

}  // namespace

TEST_F(KilledJob, LeavesNoFinishedLookingFileAndSaysWhy) {
  struct Case {
    const char* stage;  // activity label in the working file
    int signal;
  };
  const Case cases[] = {{"EXTRACTING LEVEL 0", SIGTERM}, {"Range Focusing", SIGTERM}, {"Azimuth Focusing", SIGTERM},
                        {"EXTRACTING LEVEL 0", SIGKILL}, {"Range Focusing", SIGKILL}, {"Azimuth Focusing", SIGKILL}};
  const std::string stem = sar::jobs::product_stem(product_);
  int n = 0;
  for (const Case& c : cases) {
    SCOPED_TRACE(std::string(c.stage) + (c.signal == SIGTERM ? " SIGTERM" : " SIGKILL"));
    const fs::path out = job_->dir() / ("out" + std::to_string(n++));
    std::vector<std::string> args = {"im", product_, "--orbit", in_.string(), "--aux", in_.string(),
                                     "--out", out.string(), "--quicklook", "64x64"};
    for (const auto& p : kSmallSceneParams) {
      args.push_back("--param");
      args.push_back(p);
    }
    auto run = std::async(std::launch::async, [&] { return sarfocus(args); });
    const fs::path work = out / ".sarfocus" / stem;
    bool killed = false;
    const auto until = std::chrono::steady_clock::now() + std::chrono::seconds(120);
    while (!killed && run.wait_for(std::chrono::milliseconds(1)) != std::future_status::ready &&
           std::chrono::steady_clock::now() < until) {
      const auto working = lines_of(work / "Vanterra.working");
      if (working.size() < 2 || working[1].find(c.stage) == std::string::npos) continue;
      if (const pid_t child = focussing_child()) killed = ::kill(child, c.signal) == 0;
    }
    const CliResult r = run.get();
    ASSERT_TRUE(killed) << "the job ended before it reached the stage\n" << r.out << r.err;
    EXPECT_NE(r.status, 0);

    if (c.signal == SIGTERM) {
      // The job stopped at its next progress report with the interruption code.
      const auto record = lines_of(work / "Vanterra.working_error");
      ASSERT_GE(record.size(), 4u);
      EXPECT_EQ(record[1], "PROCESSING INTERRUPTED BY THE OPERATOR");
      EXPECT_NE(record[2].find("[EC : 326400]"), std::string::npos);
      EXPECT_EQ(record[3].rfind(std::string("SIGTERM received during ") + c.stage, 0), 0u) << record[3];
      EXPECT_NE(r.err.find("SIGTERM received during"), std::string::npos) << r.err;
    } else {
      // The activity named is the last one sarfocus saw, which may be the one before the kill.
      EXPECT_NE(r.err.find("focussing was killed by SIGKILL during '"), std::string::npos) << r.err;
      EXPECT_EQ(r.status, 128 + SIGKILL);
    }
    // Nothing in the output folder but the working folders, no marker, no product by its name.
    for (const auto& e : fs::directory_iterator(out)) EXPECT_EQ(e.path().filename(), ".sarfocus");
    EXPECT_FALSE(fs::exists(work / "sarfocus.complete"));
    for (const auto& e : fs::directory_iterator(work)) {
      const std::string name = e.path().filename().string();
      const bool partial = name.ends_with(".part") || name.find(".tmp") != std::string::npos;
      if (name.rfind(stem + "_", 0) == 0) {
        EXPECT_TRUE(partial) << name;
        // SIGTERM unwinds the job: even its partial files are gone.
        EXPECT_NE(c.signal, SIGTERM) << name;
      }
    }
  }
}

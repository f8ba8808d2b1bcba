// The file protocol with the host: stopping a run, configuration faults, and parameter faults.
#include <gtest/gtest.h>

#include "job_harness.hpp"

using namespace sar::test;

namespace {

std::string im_command(ScratchJob& job) {
  return "main_focussing_asar_IM#" + job.layout();
}

void rewrite_working_file(const ScratchJob& job, const std::string& first) {
  std::ofstream(job.dir() / "Vanterra.working", std::ios::trunc) << first << "\nHost label\n";
}

}  // namespace

TEST(Protocol, HostStopsTheRunThroughTheWorkingFile) {
  struct Case {
    const char* name;
    bool remove;       // delete the working file; otherwise write the value
    const char* value;
  };
  for (Case c : {Case{"deleted", true, ""}, Case{"value_101", false, "101"}, Case{"value_250", false, "250"}}) {
    SCOPED_TRACE(c.name);
    ScratchJob job(std::string("stop_") + c.name);
    const std::string cmd = im_command(job);
    std::ofstream(job.dir() / "Vanterra.working_batch_ok") << "alive\n";
    if (c.remove) fs::remove(job.dir() / "Vanterra.working");
    else rewrite_working_file(job, c.value);

    const RunResult r = job.run(cmd, "VANTERRA_TRACING=ACTIVE");
    EXPECT_EQ(job.error_code(), 326400);
    EXPECT_EQ(r.status, 5);
    // The heartbeat is consumed at every progress step.
    EXPECT_FALSE(fs::exists(job.dir() / "Vanterra.working_batch_ok"));
    if (c.remove) {
      // No working file to rewrite: the record goes beside it.
      EXPECT_FALSE(fs::exists(job.dir() / "Vanterra.working"));
      const auto tmp = lines_of(job.dir() / "Vanterra.working_tmp");
      ASSERT_GE(tmp.size(), 4u);
      EXPECT_EQ(tmp[0], "-1");
    } else {
      EXPECT_EQ(job.working_lines().at(0), "-1");
    }
    EXPECT_NE(slurp(job.dir() / "Vanterra.trace_save").find("EXECUTION INTERRUPTED BY OPERATOR"),
              std::string::npos);
    EXPECT_FALSE(fs::exists(job.dir() / "out_slc"));
    EXPECT_FALSE(fs::exists(job.dir() / "product_slc"));
  }
}

TEST(Protocol, ValueOf100DoesNotStopTheRun) {
  ScratchJob job("value_100");
  const std::string cmd = im_command(job);
  rewrite_working_file(job, "100");
  job.run(cmd);
  // Went on into the extraction, which stops where the truncated product ends.
  EXPECT_EQ(job.error_code(), 1305606);
}

TEST(Protocol, ConfigurationFaults) {
  struct Case {
    const char* name;
    int keepLines;          // lines of the shipped configuration kept; -1 all
    const char* env;        // extra environment
    int ec;
    const char* detail;
  };
  for (Case c : {Case{"no_init_dir", -1, "VANTERRA_INIT_DIR=", 783360, "VANTERRA_INIT_DIR"},
                 Case{"init_dir_without_file", -1, "VANTERRA_INIT_DIR=/nonexistent_init_dir", 261122, nullptr},
                 Case{"thirteen_lines", 13, "", 783360, "VANTERRA_DUMMY_VALUE"},
                 Case{"two_lines", 2, "", 783360, "VANTERRA_WORKING_DIR"}}) {
    SCOPED_TRACE(c.name);
    ScratchJob job(std::string("config_") + c.name);
    const std::string cmd = im_command(job);
    if (c.keepLines >= 0) {
      auto lines = lines_of(job.dir() / "Vanterra_configuration.ini");
      lines.resize(static_cast<std::size_t>(c.keepLines));
      std::ofstream out(job.dir() / "Vanterra_configuration.ini", std::ios::trunc);
      for (const auto& l : lines) out << l << '\n';
    }
    const RunResult r = job.run(cmd, std::string(c.env) + " VANTERRA_WORKING_DIR=" + job.dir().string());
    EXPECT_EQ(r.status, 12 - (c.ec == 261122 ? 8 : 0));
    EXPECT_EQ(job.error_code(), c.ec);
    if (c.detail) {
      EXPECT_EQ(job.error_lines().at(3), c.detail);
    }
  }
}

TEST(Protocol, ParameterFileKeys) {
  struct Case {
    const char* name;
    const char* dropKey;
    int status;
    int ec;  // -1: no error record at all
  };
  for (Case c : {Case{"missing_mandatory_key", "Azblk", 1, -1}, Case{"missing_overlap", "AzimuthOverlap", 1, -1},
                 Case{"missing_pol_weights", "Pol_Weights", 1, -1},
                 Case{"missing_report_level", "Report_level", 20, 1305606}}) {  // on into the extraction
    SCOPED_TRACE(c.name);
    ScratchJob job(std::string("params_") + c.name);
    const std::string cmd = im_command(job);
    const fs::path params = job.dir() / "des" / "parameters_IM.hdr";
    std::string text = slurp(params);
    const auto at = text.find(std::string("\n") + c.dropKey + " ");
    ASSERT_NE(at, std::string::npos);
    text.erase(at + 1, text.find('\n', at + 1) - at);
    std::ofstream(params, std::ios::trunc) << text;

    const RunResult r = job.run(cmd);
    EXPECT_EQ(r.status, c.status) << r.err;
    EXPECT_EQ(job.error_code(), c.ec);
    if (c.ec < 0) {
      EXPECT_NE(r.err.find(std::string("key ") + c.dropKey), std::string::npos) << r.err;
      EXPECT_NE(job.working_lines().at(0), "-1");
    }
  }
}

TEST(Protocol, InputsAreNeverModified) {
  ScratchJob job("inputs");
  const std::string cmd = im_command(job);
  const auto before = fs::last_write_time(kIm0);
  const std::string bytes = slurp(kIm0);
  job.run(cmd);
  EXPECT_EQ(fs::last_write_time(kIm0), before);
  EXPECT_EQ(slurp(kIm0), bytes);
}

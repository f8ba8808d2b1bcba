// Run services in process: host files, labels, progress, error records and catalogues.
#include <gtest/gtest.h>
#include <unistd.h>

#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <sstream>

#include "base/arguments.hpp"
#include "base/errors.hpp"
#include "base/run_services.hpp"

namespace fs = std::filesystem;
using namespace sar::base;

namespace {

std::vector<std::string> lines_of(const fs::path& p) {
  std::vector<std::string> out;
  std::ifstream in(p);
  for (std::string l; std::getline(in, l);) out.push_back(l);
  return out;
}

class RunServices : public ::testing::Test {
 protected:
  void SetUp() override {
    dir_ = fs::temp_directory_path() / ("runsvc_" + std::to_string(::getpid()) + "_" +
                                        ::testing::UnitTest::GetInstance()->current_test_info()->name());
    fs::remove_all(dir_);
    fs::create_directories(dir_);
    const std::string d = dir_.string() + "/";
    std::ofstream ini(dir_ / "Vanterra_configuration.ini");
    ini << d << "\n" << d << "\n" << d << "\n" << d << "\n" << d << "\n"
        << SAR_DATA_DIR << "/\n" << d << "\n" << d << "\n" << d << "\n" << d << "\nm\nINACTIVE\n\n-9999.5\n";
    ini.close();
    ::setenv("VANTERRA_INIT_DIR", dir_.c_str(), 1);
    ::unsetenv("VANTERRA_WORKING_DIR");
    ::unsetenv("VANTERRA_BATCH_DIR");
    ::unsetenv("VANTERRA_WORKING_FILE");
    ::unsetenv("VANTERRA_TRACING");
    InitRunServices(1, kVersionText, 1);
    std::ofstream(working()) << "0\n-\n";
  }
  void TearDown() override {
    CloseRunServices();
    fs::remove_all(dir_);
  }
  fs::path working() const { return dir_ / "Vanterra.working"; }
  fs::path dir_;
};

}  // namespace

TEST_F(RunServices, HostFilesLiveInTheWorkingDirectory) {
  EXPECT_EQ(working_file_path(), working().string());
  EXPECT_EQ(error_file_path(), working().string() + "_error");
  EXPECT_EQ(heartbeat_file_path(), working().string() + "_batch_ok");
  std::string v;
  EXPECT_EQ(fdfGetEnvVar(v, "VANTERRA_DEFAULT_BYTE_ORDER"), 0);
  EXPECT_EQ(v, "m");
  EXPECT_EQ(fdfGetEnvVar(v, "NO_SUCH_NAME"), -11);
  EXPECT_TRUE(LogPrintf("hello %d\n", 7));
  EXPECT_FALSE(tracing_on());
  EXPECT_FALSE(TracePrintf("not written\n"));
}

TEST_F(RunServices, ActivityLabelIsPrefixedFlattenedAndCut) {
  SetActivityLabel("Range\nFocusing");
  EXPECT_EQ(activity_label(), " Range Focusing");
  SetActivityLabel(std::string(100, 'a'));
  EXPECT_EQ(activity_label().size(), 80u);
}

TEST_F(RunServices, ProgressWritesValueAndLabelAndKeepsTheStoredLabel) {
  std::ofstream(heartbeat_file_path()) << "x";
  const std::string label = "Range Focusing";
  EXPECT_TRUE(getAndSetPerc(5, 5, &label));  // no change: nothing touched
  EXPECT_TRUE(fs::exists(heartbeat_file_path()));
  EXPECT_EQ(lines_of(working()), (std::vector<std::string>{"0", "-"}));

  EXPECT_TRUE(getAndSetPerc(0, 42, &label));
  EXPECT_FALSE(fs::exists(heartbeat_file_path()));
  EXPECT_EQ(lines_of(working()), (std::vector<std::string>{"42", "Range Focusing"}));
  EXPECT_TRUE(getAndSetPerc(42, 43, nullptr));
  EXPECT_EQ(lines_of(working()), (std::vector<std::string>{"43", "Range Focusing"}));

  waitbar_open("Azimuth Focusing");
  waitbar_update(250.0);  // counts as 100
  EXPECT_EQ(lines_of(working()), (std::vector<std::string>{"100", "Azimuth Focusing"}));
  std::ofstream(heartbeat_file_path()) << "x";
  waitbar_update(100.7);  // same truncated value: no pass
  EXPECT_TRUE(fs::exists(heartbeat_file_path()));
}

TEST_F(RunServices, ProgressRaisesInterruptionWhenTheHostStops) {
  std::ofstream(working(), std::ios::trunc) << "101\nhost\n";
  try {
    getAndSetPerc(0, 1, nullptr);
    FAIL() << "no interruption";
  } catch (const CErrorExceptionManager& e) {
    EXPECT_EQ(e.ec(), ec::kInterrupted);
  }
  fs::remove(working());
  EXPECT_THROW(getAndSetPerc(0, 1, nullptr), CErrorExceptionManager);
}

TEST_F(RunServices, ErrorRecordWrapsDetailsAndRenamesHeaderFiles) {
  const std::string longDetail(100, 'd');
  const std::vector<std::string> details{"/data/scene_hdr", longDetail};
  WriteErrorRecord(ec::kFileNotFound, details);
  const auto rec = lines_of(error_file_path());
  ASSERT_EQ(rec.size(), 8u);
  EXPECT_EQ(rec[0], "-1");
  EXPECT_EQ(rec[1], "FILE ERROR");
  EXPECT_EQ(rec[2], "File not found [EC : 261122]");
  EXPECT_EQ(rec[3], "/data/scene.sml");
  EXPECT_EQ(rec[4], std::string(48, 'd'));
  // Fewer than 6 characters behind the second break point: they stay on the line.
  EXPECT_EQ(rec[5], std::string(52, 'd'));
  EXPECT_EQ(rec[6], std::string(66, ' '));
  const auto work = lines_of(working());
  EXPECT_EQ(work[0], "-1");
  EXPECT_EQ(work[1], "-");
  EXPECT_EQ(work[2], "FILE ERROR");

  // Outside the file codes a header name stays as it is.
  WriteErrorRecord(ec::kStageFailed, std::vector<std::string>{"x_hdr"});
  EXPECT_EQ(lines_of(error_file_path()).at(3), "x_hdr");
}

TEST_F(RunServices, ErrorRecordGoesBesideAMissingWorkingFile) {
  fs::remove(working());
  WriteErrorRecord(ec::kWarnings, std::vector<std::string>{""});
  const auto tmp = lines_of(working().string() + "_tmp");
  ASSERT_GE(tmp.size(), 3u);
  EXPECT_EQ(tmp[0], "-2");
  EXPECT_FALSE(fs::exists(working()));
}

TEST_F(RunServices, CatalogueTextsByCode) {
  struct Case {
    int32_t ec;
    const char* primary;
    const char* secondary;
  };
  for (Case c : {Case{130560, "A PROCESSING STAGE FAILED", ""}, Case{261122, "FILE ERROR", "File not found"},
                 Case{456963, "WRONG JOB ARGUMENTS", "Unknown processing mode in the command string"},
                 Case{1305603, "INPUT DATA MISSING OR UNUSABLE",
                      "ASA_INS instrument characterisation file missing or unusable"},
                 Case{make_ec(4, 40), "FILE ERROR", "GENERIC ERROR WRONG CODE"},
                 Case{make_ec(60, 0), "GENERIC ERROR WRONG CODE", ""}}) {
    std::string p, s;
    GetErrorTexts(c.ec, p, s);
    EXPECT_EQ(p, c.primary) << c.ec;
    EXPECT_EQ(s, c.secondary) << c.ec;
  }
}

TEST_F(RunServices, FinishRunDeletesTheWorkingFileOrMarksWarnings) {
  EXPECT_EQ(FinishRun(0, 1, 1), 0);
  EXPECT_FALSE(fs::exists(working()));

  InitRunServices(1, kVersionText, 1);
  std::ofstream(working()) << "50\nlabel\n";
  raise_warning(ec::kWarnings, "lines filled", "unit", 1);
  EXPECT_EQ(FinishRun(0, 1, 1), 0);
  EXPECT_EQ(lines_of(working()).at(0), "-2");
}

TEST(ArgumentList, LinesAreCutTrimmedAndEndedByHash) {
  const fs::path p = fs::temp_directory_path() / ("args_" + std::to_string(::getpid()));
  std::ofstream(p, std::ios::binary) << "title\n  a b  \r\n\nc\rjunk\n#end\nnever\n";
  EXPECT_EQ(ReadArgumentList(p.string(), true), (std::vector<std::string>{"title", "a b", "", "c"}));
  EXPECT_EQ(GetJobArguments(p.string() + "###Vanterra###host"), (std::vector<std::string>{"a b", "", "c"}));
  fs::remove(p);
}

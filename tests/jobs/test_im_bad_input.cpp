// The IM job on inputs and conditions that must stop it: each ends with its code in the error
// file, and no SLC is left where a complete one would be expected. And the auxiliary lookup: a
// list that leaves ASA_INS and ASA_XCA to the job finds them through the index.
#include <gtest/gtest.h>
#include <sys/mount.h>

#include <functional>
#include <regex>

#include "base/errors.hpp"
#include "job_harness.hpp"
#include "jobs/aux_lookup.hpp"
#include "simulator/simulator.hpp"

using namespace sar::test;
namespace sim = sar::simulator;
namespace ec = sar::base::ec;

namespace {

constexpr int kLines = 3000;
constexpr int kSamples = 800;

std::string error_text(const ScratchJob& job) {
  std::string text;
  for (const auto& l : job.error_lines()) text += l + "\n";
  return text;
}

// One small product per fault kind, made once for the whole suite.
class ImBadInput : public ::testing::Test {
 protected:
  static fs::path root() { return fs::temp_directory_path() / ("im_bad_input_" + std::to_string(::getpid())); }

  static sim::SimulationTruth make(const std::string& name, std::vector<sim::Fault> faults,
                                   const std::string& sceneTime = "02-MAR-2008 10:00:00.000000") {
    sim::SimulationConfig c;
    c.out_dir = (root() / name).string();
    c.lines = kLines;
    c.samples = kSamples;
    c.noise_db = -10.0;
    c.faults = std::move(faults);
    c.scene_time = sceneTime;
    c.targets = {{{45.0, 10.0, 0.0}, 30.0}};
    c.ins_template = kInsTemplate;
    c.xca_template = kXcaTemplate;
    return sim::run_simulation(c);
  }

  static void SetUpTestSuite() {
    fs::remove_all(root());
    clean_ = new sim::SimulationTruth(make("clean", {}));
    truncated_ = new sim::SimulationTruth(make("truncated", {sim::Fault::kTruncated}));
    // Two weeks after the real DOR_VOR of the harness ends.
    late_ = new sim::SimulationTruth(make("late", {}, "20-MAR-2008 10:00:00.000000"));
  }
  static void TearDownTestSuite() {
    delete clean_;
    delete truncated_;
    delete late_;
    fs::remove_all(root());
  }

  // Lays out `job` for `product` with the block sizes of a small scene; returns the command.
  static std::string prepare(ScratchJob& job, const sim::SimulationTruth& product, std::string orbit = "",
                             std::string ins = "", std::string xca = "",
                             std::vector<std::string> auxDirs = {}) {
    const std::string out = (job.dir() / "out" / "scene").string();
    const std::string list =
        job.layout({product.level0_path, orbit.empty() ? product.orbit_path : orbit,
                    ins.empty() ? product.ins_path : ins, xca.empty() ? product.xca_path : xca, out, "128", "128",
                    "NotOK", "NotOK", "NotOK", "NotOK", "NotOK", "OK", "1.0"},
                   "IM", std::move(auxDirs));
    set_parameters(job.dir() / "des" / "parameters_IM.hdr",
                   {{"LinesInBlock", "2048"}, {"AzimuthOverlap", "1280"}, {"SamplesInBlock", "512"},
                    {"RangeOverlap", "128"}, {"Azblk", "1000"}});
    return "main_focussing_asar_IM#" + list;
  }

  static fs::path slc(const ScratchJob& job) { return job.dir() / "out" / "scene_slc"; }

  // Nothing that looks like a finished product, and no leftover of an unfinished one.
  static void expect_no_product(const ScratchJob& job) {
    const fs::path out = job.dir() / "out";
    EXPECT_FALSE(fs::exists(slc(job)));
    EXPECT_FALSE(fs::exists(slc(job).string() + "_hdr"));
    EXPECT_FALSE(fs::exists(slc(job).string() + ".sml"));
    EXPECT_FALSE(fs::exists(slc(job).string() + ".tif"));
    if (!fs::exists(out)) return;
    for (const auto& e : fs::directory_iterator(out)) EXPECT_NE(e.path().extension(), ".part") << e.path();
  }

  static sim::SimulationTruth* clean_;
  static sim::SimulationTruth* truncated_;
  static sim::SimulationTruth* late_;
};

sim::SimulationTruth* ImBadInput::clean_ = nullptr;
sim::SimulationTruth* ImBadInput::truncated_ = nullptr;
sim::SimulationTruth* ImBadInput::late_ = nullptr;

TEST_F(ImBadInput, StopsWithTheRightCodeAndLeavesNoProduct) {
  struct Case {
    const char* name;
    std::function<std::string(ScratchJob&)> prepare;
    int code;
    const char* detail;  // a text the error file must hold
  };
  const Case cases[] = {
      {"orbit does not cover the scene",
       [](ScratchJob& j) { return prepare(j, *late_, kVor); }, ec::kStageFailed, "IMprocessor()"},
      {"product ends inside a packet",
       [](ScratchJob& j) { return prepare(j, *truncated_); }, ec::kFileIo, ""},
      {"azimuth overlap leaves no line of a block",
       [](ScratchJob& j) {
         const std::string cmd = prepare(j, *clean_);
         set_parameters(j.dir() / "des" / "parameters_IM.hdr", {{"AzimuthOverlap", "2048"}});
         return cmd;
       },
       ec::kStageFailed, "IMprocessor()"},
      {"ASA_INS left to the lookup, no index entry holds the date",
       [](ScratchJob& j) {
         const std::string cmd = prepare(j, *clean_, "", "NotOK", "NotOK");
         sar::jobs::write_aux_index({}, (j.dir() / "des").string() + "/");
         return cmd;
       },
       ec::kStageFailed, "find_aux()"},
      {"ASA_INS left to the lookup, the index knows only other years",
       [](ScratchJob& j) { return prepare(j, *clean_, "", "NotOK", "NotOK", {late_->ins_path}); },
       ec::kStageFailed, "find_aux()"},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    ScratchJob job("bad_input");
    const RunResult r = job.run(c.prepare(job));
    // The exit status carries the code's primary group; the error file the whole of it.
    EXPECT_EQ(r.status, sar::base::pec_of(c.code)) << r.err;
    EXPECT_EQ(job.error_code(), c.code) << job.log();
    EXPECT_NE(error_text(job).find(c.detail), std::string::npos) << error_text(job);
    expect_no_product(job);
  }
}

// The raw line file of extraction holds a float time and complex floats per line.
constexpr long long kRawBytes = static_cast<long long>(kLines) * (kSamples * 8 + 4);

// A file size limit stands in for a disk that fills while the raw lines are written.
TEST_F(ImBadInput, FileSizeLimitEndsTheJobWithoutAProduct) {
  ScratchJob job("full_disk");
  const std::string cmd = prepare(job, *clean_);
  // The job runs under /bin/sh, whose ulimit -f counts 512-byte blocks.
  const RunResult r = job.run(cmd, "", "ulimit -f " + std::to_string(kRawBytes / 2 / 512) + " &&");
  EXPECT_NE(r.status, 0) << r.err;
  EXPECT_EQ(job.error_code(), ec::kFileIo) << job.log();
  EXPECT_NE(error_text(job).find("EXTR"), std::string::npos) << error_text(job);
  expect_no_product(job);
}

// A real full disk, where the system allows mounting one: the output folder is a tmpfs with room
// for the raw lines (which stay, as work files do) but not for the whole SLC.
TEST_F(ImBadInput, FullFilesystemWhileWritingTheSlcLeavesNoProduct) {
  ScratchJob job("tmpfs");
  const std::string cmd = prepare(job, *clean_);
  const fs::path out = job.dir() / "out";
  fs::create_directories(out);
  const std::string options = "size=" + std::to_string(kRawBytes + (1 << 20));
  if (::mount("tmpfs", out.c_str(), "tmpfs", 0, options.c_str()) != 0)
    GTEST_SKIP() << "no permission to mount a tmpfs here";
  const RunResult r = job.run(cmd);
  EXPECT_NE(r.status, 0) << r.err;
  EXPECT_EQ(job.error_code(), ec::kFileIo) << job.log();
  EXPECT_NE(error_text(job).find("scene_slc"), std::string::npos) << error_text(job);
  expect_no_product(job);
  ::umount(out.c_str());
}

// The list leaves ASA_INS and ASA_XCA to the job; the index of the description folder, built
// from an archive that holds the product's own auxiliary files, supplies them.
TEST_F(ImBadInput, NotOkAuxiliaryFilesAreFoundThroughTheIndex) {
  ScratchJob job("find_aux");
  const std::string cmd =
      prepare(job, *clean_, "", "NotOK", "NotOK", {fs::path(clean_->ins_path).parent_path().string()});
  const auto entries = sar::jobs::read_aux_index((job.dir() / "des").string() + "/");
  ASSERT_GE(entries.size(), 2u);
  const RunResult r = job.run(cmd);
  ASSERT_EQ(r.status, 0) << r.err << job.log();
  EXPECT_TRUE(fs::exists(slc(job)));
  EXPECT_TRUE(fs::exists(slc(job).string() + "_hdr"));
  // The log names the auxiliary files the job found.
  const std::string log = job.log();
  EXPECT_NE(log.find(fs::path(clean_->ins_path).filename().string()), std::string::npos) << log;
  EXPECT_NE(log.find(fs::path(clean_->xca_path).filename().string()), std::string::npos) << log;
}

}  // namespace

// The IM job on inputs and conditions that must stop it: each ends with its code in the error
// file, and no SLC is left where a complete one would be expected. And the auxiliary lookup: a
// list that leaves ASA_INS and ASA_XCA to the job finds them through the index.
#include <gtest/gtest.h>
#include <sys/mount.h>

#include <functional>
#include <map>
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

// The job a bad input is given to: its mode prefix, the simulator's acquisition, and what
// it names in the error record and its products.
struct JobUnderTest {
  const char* mode;              // "IM", "AP"
  sim::AcquisitionMode acquisition;
  const char* parameterFile;
  const char* processorDetail;   // "IMprocessor()"
  std::vector<std::string> slcs;  // product names after the output root
};

const JobUnderTest kImJob{"IM", sim::AcquisitionMode::kIM, "parameters_IM.hdr", "IMprocessor()", {"_slc"}};
const JobUnderTest kApJob{"AP", sim::AcquisitionMode::kAPH, "parameters_AP.hdr", "APprocessor()",
                          {"_hv_slc", "_hh_slc"}};

// One small product per fault kind and acquisition, made once for the whole suite.
class ImBadInput : public ::testing::Test {
 protected:
  static fs::path root() { return fs::temp_directory_path() / ("im_bad_input_" + std::to_string(::getpid())); }

  static sim::SimulationTruth make(const std::string& name, std::vector<sim::Fault> faults,
                                   const std::string& sceneTime = "02-MAR-2008 10:00:00.000000",
                                   sim::AcquisitionMode mode = sim::AcquisitionMode::kIM) {
    sim::SimulationConfig c;
    c.mode = mode;
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

  // The products of an acquisition: clean, truncated, and two weeks after the real DOR_VOR of
  // the harness ends.
  struct Products {
    sim::SimulationTruth clean, truncated, late;
  };
  static const Products& products(sim::AcquisitionMode mode) {
    static std::map<sim::AcquisitionMode, Products> made;
    auto it = made.find(mode);
    if (it == made.end()) {
      const std::string tag = sim::mode_name(mode);
      it = made.emplace(mode, Products{make(tag + "_clean", {}, "02-MAR-2008 10:00:00.000000", mode),
                                       make(tag + "_truncated", {sim::Fault::kTruncated}, "02-MAR-2008 10:00:00.000000", mode),
                                       make(tag + "_late", {}, "20-MAR-2008 10:00:00.000000", mode)})
               .first;
    }
    return it->second;
  }

  static void SetUpTestSuite() {
    fs::remove_all(root());
    clean_ = &products(sim::AcquisitionMode::kIM).clean;
    truncated_ = &products(sim::AcquisitionMode::kIM).truncated;
    late_ = &products(sim::AcquisitionMode::kIM).late;
  }
  static void TearDownTestSuite() { fs::remove_all(root()); }

  // Lays out `job` for `product` with the block sizes of a small scene; returns the command.
  static std::string prepare(ScratchJob& job, const sim::SimulationTruth& product, std::string orbit = "",
                             std::string ins = "", std::string xca = "",
                             std::vector<std::string> auxDirs = {}, const JobUnderTest& under = kImJob) {
    const std::string out = (job.dir() / "out" / "scene").string();
    const std::string list =
        job.layout({product.level0_path, orbit.empty() ? product.orbit_path : orbit,
                    ins.empty() ? product.ins_path : ins, xca.empty() ? product.xca_path : xca, out, "128", "128",
                    "NotOK", "NotOK", "NotOK", "NotOK", "NotOK", "OK", "1.0"},
                   under.mode, std::move(auxDirs));
    set_parameters(job.dir() / "des" / under.parameterFile,
                   {{"LinesInBlock", "2048"}, {"AzimuthOverlap", "1280"}, {"SamplesInBlock", "512"},
                    {"RangeOverlap", "128"}, {"Azblk", "1000"}});
    return std::string("main_focussing_asar_") + under.mode + "#" + list;
  }

  static fs::path slc(const ScratchJob& job, const std::string& name = "_slc") {
    return job.dir() / "out" / ("scene" + name);
  }

  // Nothing that looks like a finished product, and no leftover of an unfinished one.
  static void expect_no_product(const ScratchJob& job, const JobUnderTest& under = kImJob) {
    const fs::path out = job.dir() / "out";
    for (const std::string& name : under.slcs) {
      EXPECT_FALSE(fs::exists(slc(job, name)));
      EXPECT_FALSE(fs::exists(slc(job, name).string() + "_hdr"));
      EXPECT_FALSE(fs::exists(slc(job, name).string() + ".sml"));
      EXPECT_FALSE(fs::exists(slc(job, name).string() + ".tif"));
    }
    if (!fs::exists(out)) return;
    for (const auto& e : fs::directory_iterator(out)) EXPECT_NE(e.path().extension(), ".part") << e.path();
  }

  static const sim::SimulationTruth* clean_;
  static const sim::SimulationTruth* truncated_;
  static const sim::SimulationTruth* late_;
};

const sim::SimulationTruth* ImBadInput::clean_ = nullptr;
const sim::SimulationTruth* ImBadInput::truncated_ = nullptr;
const sim::SimulationTruth* ImBadInput::late_ = nullptr;

// The same table for both stripmap jobs: what stops one must stop the other, with its names.
TEST_F(ImBadInput, StopsWithTheRightCodeAndLeavesNoProduct) {
  struct Case {
    const char* name;
    std::function<std::string(ScratchJob&, const JobUnderTest&, const Products&)> prepare;
    int code;
    const char* detail;  // a text the error file must hold; "@" stands for the processor's name
    const char* onlyMode = nullptr;  // the row applies to this job alone
  };
  using P = const Products&;
  using J = const JobUnderTest&;
  const Case cases[] = {
      {"orbit does not cover the scene",
       [](ScratchJob& j, J u, P p) { return prepare(j, p.late, kVor, "", "", {}, u); }, ec::kStageFailed, "@"},
      {"the orbit's span and the scene's times are in the record",
       [](ScratchJob& j, J u, P p) { return prepare(j, p.late, kVor, "", "", {}, u); }, ec::kStageFailed,
       "outside orbit 01-MAR-2008 21:55:27 to 03-MAR-2008 00:23:27"},
      {"product ends inside a packet",
       [](ScratchJob& j, J u, P p) { return prepare(j, p.truncated, "", "", "", {}, u); }, ec::kFileIo, ""},
      {"azimuth overlap leaves no line of a block",
       [](ScratchJob& j, J u, P p) {
         const std::string cmd = prepare(j, p.clean, "", "", "", {}, u);
         set_parameters(j.dir() / "des" / u.parameterFile, {{"AzimuthOverlap", "2048"}});
         return cmd;
       },
       ec::kStageFailed, "@"},
      {"ASA_INS left to the lookup, no index entry holds the date",
       [](ScratchJob& j, J u, P p) {
         const std::string cmd = prepare(j, p.clean, "", "NotOK", "NotOK", {}, u);
         sar::jobs::write_aux_index({}, (j.dir() / "des").string() + "/");
         return cmd;
       },
       ec::kStageFailed, "find_aux()"},
      {"ASA_INS left to the lookup, the index knows only other years",
       [](ScratchJob& j, J u, P p) {
         return prepare(j, p.clean, "", "NotOK", "NotOK", {fs::path(p.late.ins_path).parent_path().string()}, u);
       },
       ec::kStageFailed, "find_aux()"},
      {"an ASA_INS given as ASA_XCA",
       [](ScratchJob& j, J u, P p) { return prepare(j, p.clean, "", "", p.clean.ins_path, {}, u); },
       ec::kBadArguments, "ASA_XCA", "AP"},
      {"an ASA_XCA given as ASA_INS",
       [](ScratchJob& j, J u, P p) { return prepare(j, p.clean, "", p.clean.xca_path, "", {}, u); },
       ec::kBadArguments, "ASA_INS", "AP"},
      {"packets whose polarisation contradicts the timeline",
       [](ScratchJob& j, J u, P) {
         static const sim::SimulationTruth swapped =
             make("swapped", {sim::Fault::kSwappedPolarisation}, "02-MAR-2008 10:00:00.000000", u.acquisition);
         return prepare(j, swapped, "", "", "", {}, u);
       },
       ec::kBadArguments, "polarisation contradicts the timeline", "AP"},
      {"a product of the other stripmap job",
       [](ScratchJob& j, J u, P) {
         const JobUnderTest& other = std::string(u.mode) == "IM" ? kApJob : kImJob;
         const Products& theirs = products(other.acquisition);
         return prepare(j, theirs.clean, "", "", "", {}, u);
       },
       ec::kBadArguments, "ASA_"},
  };
  for (const JobUnderTest* under : {&kImJob, &kApJob}) {
    const Products& p = products(under->acquisition);
    for (const Case& c : cases) {
      if (c.onlyMode && std::string(c.onlyMode) != under->mode) continue;
      SCOPED_TRACE(std::string(under->mode) + ": " + c.name);
      ScratchJob job("bad_input");
      const RunResult r = job.run(c.prepare(job, *under, p));
      // The exit status carries the code's primary group; the error file the whole of it.
      EXPECT_EQ(r.status, sar::base::pec_of(c.code)) << r.err;
      EXPECT_EQ(job.error_code(), c.code) << job.log();
      const std::string detail = std::string(c.detail) == "@" ? under->processorDetail : c.detail;
      // Details wrap at the record's line width.
      std::string flat = error_text(job);
      std::erase(flat, '\n');
      EXPECT_NE(flat.find(detail), std::string::npos) << error_text(job);
      expect_no_product(job, *under);
    }
  }
}

// The raw line file of extraction holds a float time and complex floats per line.
constexpr long long kRawBytes = static_cast<long long>(kLines) * (kSamples * 8 + 4);

// A file size limit stands in for a disk that fills while the raw lines are written.
TEST_F(ImBadInput, FileSizeLimitEndsTheJobWithoutAProduct) {
  ScratchJob job("full_disk");
  const std::string cmd = prepare(job, *clean_);
  // In file mode the extraction writes its line file, and the limit stops it there.
  set_parameters(job.dir() / "des" / "parameters_IM.hdr", {{"Flag_incore", "0"}});
  // The job runs under /bin/sh, whose ulimit -f counts 512-byte blocks.
  const RunResult r = job.run(cmd, "", "ulimit -f " + std::to_string(kRawBytes / 2 / 512) + " &&");
  EXPECT_NE(r.status, 0) << r.err;
  EXPECT_EQ(job.error_code(), ec::kFileIo) << job.log();
  EXPECT_NE(error_text(job).find("EXTR"), std::string::npos) << error_text(job);
  expect_no_product(job);
}

// A real full disk, where the system allows mounting one: the output folder is a tmpfs with room
// for the small work files but not for the whole SLC (with the scene in memory the raw lines
// never reach the disk).
TEST_F(ImBadInput, FullFilesystemWhileWritingTheSlcLeavesNoProduct) {
  ScratchJob job("tmpfs");
  const std::string cmd = prepare(job, *clean_);
  const fs::path out = job.dir() / "out";
  fs::create_directories(out);
  const std::string options = "size=" + std::to_string(1 << 19);
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

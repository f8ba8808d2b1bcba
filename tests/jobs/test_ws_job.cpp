// The wide swath job on a small simulated product: five focused sub-swath images with their
// headers, and the inputs that must stop it with their codes and nothing half-written.
#include <gtest/gtest.h>

#include <fstream>
#include <functional>
#include <regex>
#include <string>
#include <vector>

#include "base/errors.hpp"
#include "job_harness.hpp"
#include "simulator/simulator.hpp"

using namespace sar::test;
namespace sim = sar::simulator;
namespace ec = sar::base::ec;

namespace {

const std::string kXch = real("ASA_XCH_AX", "ASA_XCH_AXVIEC20101222_143057_20020301_000000_20141231_000000");

class WsJob : public ::testing::Test {
 protected:
  static fs::path root() { return fs::temp_directory_path() / ("ws_job_" + std::to_string(::getpid())); }
  static void SetUpTestSuite() {
    fs::remove_all(root());
    sim::SimulationConfig c;
    c.mode = sim::AcquisitionMode::kWS;
    c.out_dir = (root() / "ws").string();
    c.samples = 640;
    c.lines = 525 + 4 * 360;
    c.noise_db = 0.0;
    c.targets = {{{45.0, 10.0, 0.0}, 30.0}};
    c.ins_template = kInsTemplate;
    c.xca_template = kXcaTemplate;
    ws_ = new sim::SimulationTruth(sim::run_simulation(c));
    sim::SimulationConfig im;
    im.out_dir = (root() / "im").string();
    im.lines = 600;
    im.samples = 600;
    im.targets = c.targets;
    im.ins_template = kInsTemplate;
    im.xca_template = kXcaTemplate;
    im_ = new sim::SimulationTruth(sim::run_simulation(im));
  }
  static void TearDownTestSuite() {
    delete ws_;
    delete im_;
    std::error_code err;
    fs::remove_all(root(), err);
  }
  static std::vector<std::string> ws_args(const ScratchJob& job, const sim::SimulationTruth& t) {
    std::vector<std::string> a(14, "");
    a[0] = t.level0_path;
    a[1] = t.orbit_path;
    a[2] = t.ins_path;
    a[3] = t.xca_path;
    a[4] = (job.dir() / "out" / "scene").string();
    a[7] = kXch;
    a[12] = "NotOK";
    return a;
  }
  static sim::SimulationTruth* ws_;
  static sim::SimulationTruth* im_;
};
sim::SimulationTruth* WsJob::ws_ = nullptr;
sim::SimulationTruth* WsJob::im_ = nullptr;

TEST_F(WsJob, FocusesFiveSubSwathsWithTheirHeaders) {
  ScratchJob job("ws_good");
  const std::string list = job.layout(ws_args(job, *ws_), "WS");
  const RunResult r = job.run("main_focussing_asar_WS#" + list);
  ASSERT_EQ(r.status, 0) << r.err << job.log();
  for (int s = 1; s <= 5; ++s) {
    const fs::path out = job.dir() / "out" / ("SS" + std::to_string(s) + ".out");
    ASSERT_TRUE(fs::exists(out)) << out;
    const std::string header = slurp(out.string() + ".hdr");
    EXPECT_NE(header.find("WideSwath SINGLE SWATH COMPLEX"), std::string::npos);
    EXPECT_NE(header.find("SS" + std::to_string(s)), std::string::npos);
    EXPECT_NE(header.find("HAMMING"), std::string::npos);
    // Whole lines: the prefix and the samples the header gives, bursts x lines a burst of them.
    const std::regex samples("Samples = ([0-9]+)"), perBurst("LinesPerBurst = ([0-9]+)"), bursts("Bursts = ([0-9]+)");
    std::smatch a, b, c;
    ASSERT_TRUE(std::regex_search(header, a, samples));
    ASSERT_TRUE(std::regex_search(header, b, perBurst));
    ASSERT_TRUE(std::regex_search(header, c, bursts));
    EXPECT_EQ(std::stoi(c[1]), ws_->whole_cycles);
    EXPECT_EQ(static_cast<long long>(fs::file_size(out)),
              static_cast<long long>(std::stoi(c[1])) * std::stoi(b[1]) * (17 + 8LL * std::stoi(a[1])));
    EXPECT_FALSE(fs::exists(job.dir() / "out" / ("rgfoc_ss" + std::to_string(s))));
  }
  EXPECT_NE(job.log().find("Ending AZFOC"), std::string::npos);
}

struct BadCase {
  const char* name;
  std::function<std::string(ScratchJob&, const sim::SimulationTruth& ws, const sim::SimulationTruth& im)> layout;
  int ec;
  const char* detail;
  const char* inLog;  // or null
};

TEST_F(WsJob, BadInputStopsWithItsCodeAndLeavesNoImage) {
  const std::vector<BadCase> cases = {
      {"image mode product",
       [](ScratchJob& j, const auto& ws, const auto& im) {
         auto a = ws_args(j, ws);
         a[0] = im.level0_path;
         return j.layout(a, "WS");
       },
       ec::kBadArguments, "ASA_WS0", nullptr},
      {"bursts outside the product",
       [](ScratchJob& j, const auto& ws, const auto&) {
         auto a = ws_args(j, ws);
         a[8] = "2";
         a[9] = "40";
         return j.layout(a, "WS");
       },
       ec::kStageFailed, "WSprocessor()", "Wrong number of bursts to focus chosen"},
      {"no ASA_XCH in the index",
       [](ScratchJob& j, const auto& ws, const auto&) {
         auto a = ws_args(j, ws);
         a[7] = "NotOK";
         // An archive of the simulated ASA_INS and ASA_XCA alone.
         const fs::path archive = j.dir() / "archive";
         fs::create_directories(archive);
         fs::copy_file(ws.ins_path, archive / fs::path(ws.ins_path).filename());
         fs::copy_file(ws.xca_path, archive / fs::path(ws.xca_path).filename());
         return j.layout(a, "WS", {archive.string()});
       },
       ec::kStageFailed, "find_aux()", nullptr},
      {"image mode packets under a wide swath header",
       [](ScratchJob& j, const auto& ws, const auto& im) {
         // The main header says wide swath; the packets' beam codes are image mode's.
         std::string bytes = slurp(im.level0_path);
         for (std::size_t at = bytes.find("ASA_IM__0"); at != std::string::npos && at < 1247;
              at = bytes.find("ASA_IM__0", at + 1))
           bytes.replace(at, 9, "ASA_WS__0");
         // And the mode letters of the specific header.
         for (std::size_t at = bytes.find("IM_", 1247); at != std::string::npos && at < 1247 + 1956;
              at = bytes.find("IM_", at + 1))
           bytes.replace(at, 3, "WS_");
         fs::create_directories(j.dir());
         const fs::path product = j.dir() / "ASA_WS__0P_from_im.N1";
         std::ofstream(product, std::ios::binary) << bytes;
         auto a = ws_args(j, ws);
         a[0] = product.string();
         return j.layout(a, "WS");
       },
       ec::kFileIo, nullptr, nullptr},
      {"an orbit that ends before the scene",
       [](ScratchJob& j, const auto& ws, const auto&) {
         auto a = ws_args(j, ws);
         // A real preliminary orbit of April 2008, a month after the simulated scene.
         a[1] = real("DOR_POR_AX", "DOR_POR_AXVF-P20080404_014700_20080401_215527_20080403_002327");
         return j.layout(a, "WS");
       },
       ec::kStageFailed, "WSprocessor()", "outside the orbit interval"},
      {"an ASA_XCA given as ASA_XCH",
       [](ScratchJob& j, const auto& ws, const auto&) {
         auto a = ws_args(j, ws);
         a[7] = ws.xca_path;
         return j.layout(a, "WS");
       },
       ec::kBadArguments, "ASA_XCH", nullptr},
  };
  for (const BadCase& c : cases) {
    SCOPED_TRACE(c.name);
    ScratchJob job(std::string("ws_bad_") + std::to_string(&c - cases.data()));
    const std::string list = c.layout(job, *ws_, *im_);
    const RunResult r = job.run("main_focussing_asar_WS#" + list);
    EXPECT_NE(r.status, 0);
    EXPECT_EQ(job.error_code(), c.ec) << r.err;
    const auto lines = job.error_lines();
    ASSERT_GE(lines.size(), 4u);
    if (c.detail) {
      EXPECT_EQ(lines[3], c.detail);
    }
    std::string record;
    for (const auto& l : lines) record += l + " | ";
    RecordProperty(std::string(c.name), record);
    if (c.inLog) {
      EXPECT_NE(job.log().find(c.inLog), std::string::npos) << job.log();
    }
    for (int s = 1; s <= 5; ++s) EXPECT_FALSE(fs::exists(job.dir() / "out" / ("SS" + std::to_string(s) + ".out")));
  }
}

}  // namespace

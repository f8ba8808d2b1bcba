// The wide swath job on a small simulated product: five focused sub-swath images with their
// headers joined into one multilooked image, slant or ground range, with its annotation and each
// target where its zero-Doppler time and range put it; and the inputs that must stop it with
// their codes and nothing half-written.
#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <cstring>
#include <fstream>
#include <functional>
#include <regex>
#include <string>
#include <vector>

#include "annotation_keys.hpp"
#include "base/convert.hpp"
#include "base/errors.hpp"
#include "job_harness.hpp"
#include "test_standalone_support.hpp"
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
    // Three targets a third of a burst cycle apart along the track: each sits elsewhere in the
    // bursts' weights.
    c.targets = {{{45.0, 10.0, 0.0}, 30.0}, {{45.004, 10.0, 0.0}, 30.0}, {{44.996, 10.0, 0.0}, 30.0}};
    c.ins_template = kInsTemplate;
    c.xca_template = kXcaTemplate;
    ws_ = new sim::SimulationTruth(sim::run_simulation(c));
    sim::SimulationConfig im;
    im.out_dir = (root() / "im").string();
    im.lines = 600;
    im.samples = 600;
    im.targets = {c.targets.front()};
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

// The multilooked image and the grid its annotation gives.
struct Image {
  int lines = 0, samples = 0;
  std::vector<float> amplitude;
  double firstTime = 0.0, lineStep = 0.0;  // sec85, s
  double nearTime = 0.0, slantStep = 0.0;  // slant range: two-way s of column 0 and between columns
  std::vector<double> groundCoeff;         // ground range: slant time of column j
  double rangeSpacing = 0.0, azimuthSpacing = 0.0;
  bool ground = false;
  // Two-way slant time of a (fractional) column.
  double column_time(double j) const {
    if (!ground) return nearTime + j * slantStep;
    double tau = 0.0;
    for (int k = 4; k >= 0; --k) tau = tau * j + groundCoeff[static_cast<std::size_t>(k)];
    return tau;
  }
  float at(int l, int c) const { return amplitude[static_cast<std::size_t>(l) * samples + c]; }
};

Image read_image(const fs::path& raster, bool ground) {
  Image im;
  im.ground = ground;
  // The image, its headers and description, and its footprint for map tools.
  for (const char* suffix : {"", ".hdr", ".vrt", "_hdr", ".sml", ".kml", ".shp", ".xml"})
    EXPECT_TRUE(fs::exists(raster.string() + suffix)) << raster << suffix;
  const fs::path a = raster.string() + "_hdr";
  im.lines = key_int(a, "NrOfLinesPerImage");
  im.samples = key_int(a, "NrOfPixelsPerLine");
  EXPECT_EQ(text_of(a, "DataUnits"), "AMPLITUDE");
  EXPECT_GT(key_int(a, "NRangeLooks"), 1);
  im.firstTime = sar::base::ascii2sec85(text_of(a, "AzimuthStartTime"));
  const auto step = doubles_of(a, "AzimuthTimeStep");
  const auto near = doubles_of(a, "FastTime");
  const auto spacing = doubles_of(a, "PixelSpacingRg");
  const auto azimuthSpacing = doubles_of(a, "PixelSpacingAz");
  if (!azimuthSpacing.empty()) im.azimuthSpacing = azimuthSpacing[0];
  EXPECT_EQ(step.size(), 1u);
  EXPECT_EQ(near.size(), 1u);
  EXPECT_EQ(spacing.size(), 1u);
  if (step.empty() || near.empty() || spacing.empty()) return im;
  im.lineStep = step[0];
  im.nearTime = near[0];
  im.rangeSpacing = spacing[0];
  im.slantStep = spacing[0] / 149896229.0;
  if (ground) {
    im.groundCoeff = doubles_of(a, "GroundRangeSlantTimeCoeff");
    EXPECT_EQ(im.groundCoeff.size(), 5u);
  }
  const std::string bytes = slurp(raster);
  EXPECT_EQ(bytes.size(), static_cast<std::size_t>(im.lines) * im.samples * 4);
  im.amplitude.resize(bytes.size() / 4);
  std::memcpy(im.amplitude.data(), bytes.data(), im.amplitude.size() * 4);
  return im;
}

// Each target at the line of its zero-Doppler time and the column of its range, within a quarter
// of a pixel (the peak refined by a parabola through its neighbours; a sub-swath put on the
// joined grid at the nearest whole column would be up to half a column off); and the same energy
// wherever it stands in the bursts' weights (0.6 dB apart without de-scalloping).
void check_targets(const Image& im, const sim::SimulationTruth& truth) {
  ASSERT_EQ(im.amplitude.size(), static_cast<std::size_t>(im.lines) * im.samples);
  ASSERT_GT(im.lineStep, 0.0);
  std::vector<double> energy;
  for (const auto& t : truth.targets) {
    const double line = (t.zero_doppler_time - im.firstTime) / im.lineStep;
    // The column whose slant time is the target's, by bisection (the times increase).
    double lo = 0.0, hi = im.samples - 1.0;
    for (int k = 0; k < 60; ++k) (im.column_time(0.5 * (lo + hi)) < t.range_time ? lo : hi) = 0.5 * (lo + hi);
    const double column = 0.5 * (lo + hi);
    SCOPED_TRACE("target at line " + std::to_string(line) + ", column " + std::to_string(column));
    ASSERT_GT(column, 10.0);
    ASSERT_LT(column, im.samples - 11.0);
    const int l0 = static_cast<int>(std::lround(line)), c0 = static_cast<int>(std::lround(column));
    ASSERT_GT(l0, 40);
    ASSERT_LT(l0, im.lines - 41);
    int bl = l0, bc = c0;
    for (int l = l0 - 20; l <= l0 + 20; ++l)
      for (int c = c0 - 8; c <= c0 + 8; ++c)
        if (im.at(l, c) > im.at(bl, bc)) bl = l, bc = c;
    auto vertex = [](double m, double z, double p) {
      const double d = m - 2.0 * z + p;
      return d < 0.0 ? 0.5 * (m - p) / d : 0.0;
    };
    const double pl = bl + vertex(im.at(bl - 1, bc), im.at(bl, bc), im.at(bl + 1, bc));
    const double pc = bc + vertex(im.at(bl, bc - 1), im.at(bl, bc), im.at(bl, bc + 1));
    EXPECT_LT(std::fabs(pl - line), 0.25) << "peak line " << pl;
    EXPECT_LT(std::fabs(pc - column), 0.25) << "peak column " << pc;
    double e = 0.0;
    // Over the main lobe, short of the next target 26 lines away.
    for (int l = bl - 8; l <= bl + 8; ++l)
      for (int c = bc - 4; c <= bc + 4; ++c) e += static_cast<double>(im.at(l, c)) * im.at(l, c);
    energy.push_back(e);
    ::testing::Test::RecordProperty("peak_offset_line_col", std::to_string(pl - line) + " " + std::to_string(pc - column));
  }
  ASSERT_EQ(energy.size(), 3u);
  // Line spacing on the ground (the annotation's, from its corners): the outer targets' distance
  // over their zero-Doppler times, the targets lying near enough along the track (their ranges
  // differ by a few columns).
  const auto& a = truth.targets[1];
  const auto& b = truth.targets[2];
  const double apart = (a.ecef - b.ecef).norm();
  const double alongTrack = apart / std::fabs(a.zero_doppler_time - b.zero_doppler_time) * im.lineStep;
  // 16.7 m against 16.9 m: the chord holds a little of the cross-track offset, and the annotation
  // measures at near range.
  EXPECT_NEAR(im.azimuthSpacing, alongTrack, 0.03 * alongTrack);
  const double spread = 10.0 * std::log10(*std::max_element(energy.begin(), energy.end()) /
                                          *std::min_element(energy.begin(), energy.end()));
  ::testing::Test::RecordProperty("target_energy_spread_db", std::to_string(spread));
  EXPECT_LT(spread, 0.4);
}

TEST_F(WsJob, FocusesFiveSubSwathsWithTheirHeaders) {
  ScratchJob job("ws_good");
  const std::string list = job.layout(ws_args(job, *ws_), "WS");
  // Keep the sub-swath work files to look at them.
  set_parameters(job.dir() / "des" / "parameters_multilook.hdr", {{"DeleteTempFile", "0"}});
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
  const Image image = read_image(job.dir() / "out" / "scene_pwr", false);
  check_targets(image, *ws_);
}

// Ground range (argument 11 "OK") with the quick-look; the sub-swath work files go at the end.
TEST_F(WsJob, GroundRangeImageWithItsQuickLook) {
  ScratchJob job("ws_ground");
  auto a = ws_args(job, *ws_);
  a[11] = "OK";
  a[12] = "OK";
  a[13] = "1.0";
  const std::string list = job.layout(a, "WS");
  const RunResult r = job.run("main_focussing_asar_WS#" + list);
  ASSERT_EQ(r.status, 0) << r.err << job.log();
  const fs::path out = job.dir() / "out";
  EXPECT_TRUE(fs::exists(out / "scene_gr.tif"));
  EXPECT_FALSE(fs::exists(out / "scene_pwr"));
  for (int s = 1; s <= 5; ++s)
    for (const char* suffix : {"", ".out", ".out.hdr"})
      EXPECT_FALSE(fs::exists(out / ("SS" + std::to_string(s) + suffix))) << s << suffix;
  const Image image = read_image(out / "scene_gr", true);
  EXPECT_NEAR(image.rangeSpacing, 75.0, 1e-9);
  check_targets(image, *ws_);
}

// sarfocus ws: the multilooked image and its annotation in the output folder, the work files
// gone; a second run with --skip-complete finds the outputs complete.
TEST_F(WsJob, SarfocusLeavesTheMultilookedProduct) {
  ScratchJob job("ws_sarfocus");
  const fs::path aux = job.dir() / "aux", out = job.dir() / "out";
  fs::create_directories(aux);
  for (const std::string& f : {ws_->ins_path, ws_->xca_path, kXch}) fs::copy_file(f, aux / fs::path(f).filename());
  const std::vector<std::string> args = {"ws", ws_->level0_path, "--orbit", ws_->orbit_path, "--aux", aux.string(),
                                         "--out", out.string(), "--ground-range", "--no-quicklook"};
  const CliResult r = sarfocus(args);
  ASSERT_EQ(r.status, 0) << r.err;
  const std::string stem = sar::jobs::product_stem(ws_->level0_path);
  std::vector<std::string> names;
  for (const auto& e : fs::directory_iterator(out))
    if (e.is_regular_file()) names.push_back(e.path().filename().string());
  std::sort(names.begin(), names.end());
  const std::vector<std::string> expected = {stem + "_gr",     stem + "_gr.dbf", stem + "_gr.hdr", stem + "_gr.kml",
                                             stem + "_gr.prj", stem + "_gr.shp", stem + "_gr.shx", stem + "_gr.sml",
                                             stem + "_gr.vrt", stem + "_gr.xml", stem + "_gr_hdr"};
  EXPECT_EQ(names, expected);
  auto withSkip = args;
  withSkip.push_back("--skip-complete");
  const CliResult again = sarfocus(withSkip);
  EXPECT_EQ(again.status, 0) << again.err;
  EXPECT_NE((again.out + again.err).find("skipped"), std::string::npos) << again.out << again.err;
}

struct BadCase {
  const char* name;
  std::function<std::string(ScratchJob&, const sim::SimulationTruth& ws, const sim::SimulationTruth& im)> layout;
  int ec;
  const char* detail;
  const char* inLog;  // or null
  bool focused;       // failed after the burst chain: its sub-swath files stay, as after any failure
};

TEST_F(WsJob, BadInputStopsWithItsCodeAndLeavesNoImage) {
  const std::vector<BadCase> cases = {
      {"image mode product",
       [](ScratchJob& j, const auto& ws, const auto& im) {
         auto a = ws_args(j, ws);
         a[0] = im.level0_path;
         return j.layout(a, "WS");
       },
       ec::kBadArguments, "ASA_WS0", nullptr, false},
      {"bursts outside the product",
       [](ScratchJob& j, const auto& ws, const auto&) {
         auto a = ws_args(j, ws);
         a[8] = "2";
         a[9] = "40";
         return j.layout(a, "WS");
       },
       ec::kStageFailed, "WSprocessor()", "Wrong number of bursts to focus chosen", false},
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
       ec::kStageFailed, "find_aux()", nullptr, false},
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
       ec::kFileIo, nullptr, nullptr, false},
      {"an orbit that ends before the scene",
       [](ScratchJob& j, const auto& ws, const auto&) {
         auto a = ws_args(j, ws);
         // A real preliminary orbit of April 2008, a month after the simulated scene.
         a[1] = real("DOR_POR_AX", "DOR_POR_AXVF-P20080404_014700_20080401_215527_20080403_002327");
         return j.layout(a, "WS");
       },
       ec::kStageFailed, "WSprocessor()", "outside the orbit interval", false},
      {"an ASA_XCA given as ASA_XCH",
       [](ScratchJob& j, const auto& ws, const auto&) {
         auto a = ws_args(j, ws);
         a[7] = ws.xca_path;
         return j.layout(a, "WS");
       },
       ec::kBadArguments, "ASA_XCH", nullptr, false},
      {"burst weights that do not add up to one",
       [](ScratchJob& j, const auto& ws, const auto&) {
         const std::string list = j.layout(ws_args(j, ws), "WS");
         set_parameters(j.dir() / "des" / "parameters_multilook.hdr", {{"W1", "0.2"}});
         return list;
       },
       ec::kStageFailed, "run()", "2 W1 + W2 must be a whole number", true},
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
    for (int s = 1; s <= 5; ++s)
      EXPECT_EQ(fs::exists(job.dir() / "out" / ("SS" + std::to_string(s) + ".out")), c.focused) << s;
    for (const char* image : {"scene_pwr", "scene_pwr.part", "scene_pwr_hdr", "scene_gr"})
      EXPECT_FALSE(fs::exists(job.dir() / "out" / image)) << image;
  }
}

}  // namespace

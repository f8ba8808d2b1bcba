// The wide swath job on a small simulated product: five focused sub-swath images with their
// headers joined into one multilooked image, slant or ground range, with its annotation and each
// target where its zero-Doppler time and range put it; and the inputs that must stop it with
// their codes and nothing half-written. On a uniform scene over sub-swaths that meet: the level
// across the seams and along the burst cycle, and the speckle's looks.
#include <gtest/gtest.h>

#include <algorithm>
#include <array>
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
#include "multilook/ws_multilook.hpp"
#include "simulator/simulator.hpp"
#include "simulator/ws_clutter.hpp"

using namespace sar::test;
namespace sim = sar::simulator;
namespace ec = sar::base::ec;

namespace {

const std::string kXch = real("ASA_XCH_AX", "ASA_XCH_AXVIEC20101222_143057_20020301_000000_20141231_000000");

// The WS job's arguments for a simulated product: its own auxiliary files, the real ASA_XCH,
// slant range, output root "scene" in the job's out folder.
std::vector<std::string> ws_args(const ScratchJob& job, const sim::SimulationTruth& t) {
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
  static sim::SimulationTruth* ws_;
  static sim::SimulationTruth* im_;
};
sim::SimulationTruth* WsJob::ws_ = nullptr;
sim::SimulationTruth* WsJob::im_ = nullptr;

// The multilooked image and the grid its annotation gives.
struct Image {
  fs::path path;
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
  im.path = raster;
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
    // Each focused sub-swath moved to its multilook work name, kept with DeleteTempFile 0.
    const fs::path out = job.dir() / "out" / ("sceneML" + std::to_string(s));
    ASSERT_TRUE(fs::exists(out)) << out;
    EXPECT_FALSE(fs::exists(job.dir() / "out" / ("SS" + std::to_string(s) + ".out")));
    EXPECT_TRUE(fs::exists(job.dir() / "out" / ("SS" + std::to_string(s))));
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
  for (int s = 1; s <= 5; ++s) {
    for (const char* suffix : {"", ".out", ".out.hdr"})
      EXPECT_FALSE(fs::exists(out / ("SS" + std::to_string(s) + suffix))) << s << suffix;
    for (const char* suffix : {"", ".hdr"})
      EXPECT_FALSE(fs::exists(out / ("sceneML" + std::to_string(s) + suffix))) << s << suffix;
  }
  // The host's list: the output root with each sub-swath's number.
  const std::string root = (out / "scene").string();
  EXPECT_EQ(lines_of(out / "sceneML.lst"), (std::vector<std::string>{root + "1", root + "2", root + "3", root + "4", root + "5"}));
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
  // The host's list of sub-swaths stays in the job's folder, with the job's record.
  EXPECT_EQ(lines_of(fs::path(sar::jobs::working_dir_for(out.string(), ws_->level0_path)) / (stem + "ML.lst")).size(), 5u);
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
    // The focused sub-swaths stay under their work names; no list for the host.
    for (int s = 1; s <= 5; ++s) {
      EXPECT_EQ(fs::exists(job.dir() / "out" / ("sceneML" + std::to_string(s))), c.focused) << s;
      EXPECT_EQ(fs::exists(job.dir() / "out" / ("sceneML" + std::to_string(s) + ".hdr")), c.focused) << s;
    }
    EXPECT_FALSE(fs::exists(job.dir() / "out" / "sceneML.lst"));
    for (const char* image : {"scene_pwr", "scene_pwr.part", "scene_pwr_hdr", "scene_gr"})
      EXPECT_FALSE(fs::exists(job.dir() / "out" / image)) << image;
  }
}

}  // namespace

// ------------------------------------------------------------------ a uniform scene, measured

namespace sar::test {
namespace {

// Five sub-swaths whose focused windows overlap (windows of 1024 samples, 472 of them left once
// the pulse and the trimmed columns are gone, starting about 400 apart), nine burst cycles of
// uniform clutter with no elevation pattern (flat patterns in the ASA_XCA the job reads), and no
// receiver noise: the joined image's level and speckle are those of the processing alone.
constexpr int kUniformSamples = 1024;
constexpr int kWindowSpacing = 400;

class WsUniformScene : public ::testing::Test {
 protected:
  static fs::path root() { return fs::temp_directory_path() / ("ws_uniform_" + std::to_string(::getpid())); }
  static void SetUpTestSuite() {
    fs::remove_all(root());
    sim::SimulationConfig c;
    c.mode = sim::AcquisitionMode::kWS;
    c.out_dir = (root() / "ws").string();
    c.samples = kUniformSamples;
    c.lines = 525 + 9 * 380;
    c.noise_db = -200.0;
    c.targets = {{{45.0, 10.0, 0.0}, 0.0}};
    c.clutter.power_db = 20.0;
    c.ws.flat_elevation = true;
    c.ins_template = kInsTemplate;
    c.xca_template = kXcaTemplate;
    const auto incidences = sim::ws_adjoining_incidences(c, kWindowSpacing);
    for (std::size_t k = 0; k < 5; ++k) c.ws.swaths[k].incidence_deg = incidences[k];
    truth_ = new sim::SimulationTruth(sim::run_simulation(c));
  }
  static void TearDownTestSuite() {
    delete truth_;
    std::error_code err;
    fs::remove_all(root(), err);
  }
  static sim::SimulationTruth* truth_;
};
sim::SimulationTruth* WsUniformScene::truth_ = nullptr;

// What the focused sub-swaths' headers say: near range, samples and the incidence the looks were
// planned for.
struct FocusedSwath {
  double nearTime = 0.0, farTime = 0.0, incidence = 0.0;
};

std::array<FocusedSwath, 5> focused_swaths(const fs::path& dir, double fs) {
  std::array<FocusedSwath, 5> out{};
  for (int s = 1; s <= 5; ++s) {
    const fs::path h = dir / ("sceneML" + std::to_string(s) + ".hdr");
    const auto near = doubles_of(h, "NearRangeTime");
    const auto ground = doubles_of(h, "SlantToGround");
    const int samples = key_int(h, "Samples");
    EXPECT_FALSE(near.empty()) << h;
    EXPECT_GE(ground.size(), 2u) << h;
    if (near.empty() || ground.size() < 2) continue;
    auto& f = out[static_cast<std::size_t>(s - 1)];
    f.nearTime = near[0];
    f.farTime = near[0] + samples / fs;
    f.incidence = std::asin(149896229.0 / ground[1]) * 180.0 / M_PI;
  }
  return out;
}

// The column of a two-way time, by bisection.
double column_of(const Image& im, double tau) {
  double lo = 0.0, hi = im.samples - 1.0;
  for (int k = 0; k < 60; ++k) (im.column_time(0.5 * (lo + hi)) < tau ? lo : hi) = 0.5 * (lo + hi);
  return 0.5 * (lo + hi);
}

double power(const Image& im, int l, int c) { return static_cast<double>(im.at(l, c)) * im.at(l, c); }

// Mean power of each column over lines [l0, l1).
std::vector<double> column_levels(const Image& im, int l0, int l1) {
  std::vector<double> level(static_cast<std::size_t>(im.samples), 0.0);
  for (int l = l0; l < l1; ++l)
    for (int c = 0; c < im.samples; ++c) level[static_cast<std::size_t>(c)] += power(im, l, c);
  for (double& v : level) v /= (l1 - l0);
  return level;
}

// The step of the level (dB) at a seam: the mean level of `width` columns on each side, `gap`
// columns off it (the scene is flat, so no slope is fitted: a fit would triple the speckle's
// share of the estimate).
double step_db(const std::vector<double>& level, double seam, int gap, int width) {
  auto mean = [&](int from, int to) {
    double s = 0.0;
    for (int c = from; c < to; ++c) s += level[static_cast<std::size_t>(c)];
    return s / (to - from);
  };
  const int s = static_cast<int>(std::floor(seam));
  return 10.0 * std::log10(mean(s + 1 + gap, s + 1 + gap + width) / mean(s - gap - width, s - gap));
}

// The burst cycle (s) and the centre time (sec85) of each sub-swath's first burst, from the
// packets.
struct Bursts {
  double cycle = 0.0;
  std::array<double, 5> firstCentre{};
};

Bursts burst_timing(const sim::SimulationTruth& t) {
  Bursts b;
  std::array<std::vector<double>, 5> starts;
  for (const auto& p : t.packets)
    if (p.burst_start && p.channel >= 0 && p.channel < 5) starts[static_cast<std::size_t>(p.channel)].push_back(p.time);
  for (std::size_t s = 0; s < 5; ++s) {
    EXPECT_GE(starts[s].size(), 2u);
    if (starts[s].size() < 2) return b;
    const auto& ch = t.channels[s];
    b.firstCentre[s] = starts[s].front() + 0.5 * (ch.burst_echoes - 1) / ch.prf;
    if (s == 0) b.cycle = (starts[s].back() - starts[s].front()) / static_cast<double>(starts[s].size() - 1);
  }
  return b;
}

// ENL of m looks of band b cut from a spectrum weighted by a Hamming window of coefficient a
// over the band B: (sum of the looks' powers)^2 over the sum of their squared covariances, which
// are the spectrum's power over the part of the band two looks share.
double range_enl(int looks, double band, double fullBand, double a) {
  const auto centres = multilook::look_centres(looks, band, fullBand);
  auto power_between = [&](double f0, double f1) {
    double s = 0.0;
    const int n = 400;
    for (int k = 0; k < n; ++k) {
      const double f = f0 + (k + 0.5) * (f1 - f0) / n;
      const double w = a + (1.0 - a) * std::cos(2.0 * M_PI * f / fullBand);
      s += w * w * (f1 - f0) / n;
    }
    return s;
  };
  double total = 0.0, covariance = 0.0;
  for (double ci : centres) {
    total += power_between(ci - band / 2, ci + band / 2);
    for (double cj : centres) {
      const double lo = std::max(ci, cj) - band / 2, hi = std::min(ci, cj) + band / 2;
      if (hi > lo) covariance += std::pow(power_between(lo, hi), 2.0);
    }
  }
  return total * total / covariance;
}

// The ENL of a region spread evenly over the burst cycle: each line's looks are the range looks
// times (sum w^2)^2 / sum w^4 of the bursts that reach it; the pooled ENL is the inverse of the
// mean of the inverses.
double expected_enl(double rangeEnl, double w1, double w2) {
  double inverse = 0.0;
  const int n = 1000;
  for (int k = 0; k < n; ++k) {
    const double v = (k + 0.5) / n;
    double w2sum = 0.0, w4sum = 0.0;
    for (int b = -2; b <= 2; ++b) {
      const double w = multilook::burst_weight(v - b, w1, w2);
      w2sum += w * w;
      w4sum += w * w * w * w;
    }
    inverse += w4sum / (rangeEnl * w2sum * w2sum);
  }
  return n / inverse;
}

struct UniformFigures {
  std::vector<double> seamSteps;   // dB, seam by seam
  std::vector<double> cycleLevel;  // dB against the mean, by tenth of the burst cycle
  std::vector<double> enl, enlExpected;  // by sub-swath
};

// Lines a burst cycle and a half in from each end, where every line is made of bursts on both
// sides of it in every sub-swath.
UniformFigures measure_uniform(const Image& im, const sim::SimulationTruth& truth, const fs::path& workDir,
                               double samplingRate, bool withEnl) {
  UniformFigures f;
  const Bursts bursts = burst_timing(truth);
  const double cycleLines = bursts.cycle / im.lineStep;
  const int first = static_cast<int>(std::ceil(1.5 * cycleLines)), last = im.lines - first;
  EXPECT_GT(last - first, 4.0 * cycleLines) << "too few steady lines";
  if (last - first < cycleLines) return f;
  const auto swaths = focused_swaths(workDir, samplingRate);
  const auto level = column_levels(im, first, last);
  // Seams in the middle of the overlaps of the focused windows.
  std::array<double, 6> bounds{};
  bounds[5] = im.samples;
  for (std::size_t s = 0; s + 1 < 5; ++s) {
    const double seam = column_of(im, 0.5 * (swaths[s].farTime + swaths[s + 1].nearTime));
    bounds[s + 1] = seam;
    f.seamSteps.push_back(step_db(level, seam, 2, im.ground ? 56 : 60));
  }
  // Along azimuth: each sub-swath's lines folded by their place in its own burst cycle, all five
  // pooled (each with its own phase, so that a scalloping adds up).
  constexpr int kBins = 10;
  std::array<double, kBins> sum{};
  std::array<double, kBins> count{};
  double all = 0.0, pixels = 0.0;
  const int looks = key_int(fs::path(im.path.string() + "_hdr"), "NRangeLooks");
  for (std::size_t s = 0; s < 5; ++s) {
    const int c0 = static_cast<int>(bounds[s]) + 3, c1 = static_cast<int>(bounds[s + 1]) - 3;
    double ss = 0.0, ss2 = 0.0;
    std::size_t n = 0;
    for (int l = first; l < last; ++l) {
      const double phase = (im.firstTime + l * im.lineStep - bursts.firstCentre[s]) / bursts.cycle;
      const auto bin = static_cast<std::size_t>(std::min(kBins - 1.0, (phase - std::floor(phase)) * kBins));
      for (int c = c0; c < c1; ++c, ++n) {
        const double p = power(im, l, c);
        sum[bin] += p;
        count[bin] += 1.0;
        ss += p;
        ss2 += p * p;
      }
    }
    all += ss;
    pixels += static_cast<double>(n);
    if (!withEnl) continue;
    multilook::LookPlan plan;
    EXPECT_EQ(multilook::plan_looks(16e6, swaths[s].incidence, 150, plan), 0);
    const double mean = ss / static_cast<double>(n);
    f.enl.push_back(mean * mean / (ss2 / static_cast<double>(n) - mean * mean));
    f.enlExpected.push_back(expected_enl(range_enl(looks, plan.band, 16e6, 0.75), 0.25, 0.5));
  }
  for (std::size_t b = 0; b < kBins; ++b) f.cycleLevel.push_back(10.0 * std::log10(sum[b] / count[b] / (all / pixels)));
  return f;
}

std::string figures_text(const std::vector<double>& v) {
  std::string s;
  for (double x : v) {
    if (!s.empty()) s += ' ';
    s += std::to_string(x);
  }
  return s;
}

void check_uniform(const UniformFigures& f, const std::string& tag) {
  ASSERT_EQ(f.seamSteps.size(), 4u);
  for (std::size_t s = 0; s < f.seamSteps.size(); ++s)
    EXPECT_LT(std::fabs(f.seamSteps[s]), 0.2) << "seam SS" << s + 1 << "/SS" << s + 2;
  for (std::size_t b = 0; b < f.cycleLevel.size(); ++b)
    EXPECT_LT(std::fabs(f.cycleLevel[b]), 0.2) << "tenth " << b << " of the burst cycle";
  for (std::size_t s = 0; s < f.enl.size(); ++s)
    EXPECT_NEAR(f.enl[s] / f.enlExpected[s], 1.0, 0.1) << "SS" << s + 1 << ": ENL " << f.enl[s] << ", expected " << f.enlExpected[s];
  ::testing::Test::RecordProperty(tag + "seam_steps_db", figures_text(f.seamSteps));
  ::testing::Test::RecordProperty(tag + "burst_cycle_levels_db", figures_text(f.cycleLevel));
  ::testing::Test::RecordProperty(tag + "enl", figures_text(f.enl));
  ::testing::Test::RecordProperty(tag + "enl_expected", figures_text(f.enlExpected));
}

// Slant and ground range (one test, so that the scene is simulated once): the level is flat
// across the four seams and along the burst cycle, and in slant range the speckle has the looks
// the range looks and the burst weights give.
TEST_F(WsUniformScene, JoinedImageIsFlatWithTheLooksItsWeightsGive) {
  for (const bool ground : {false, true}) {
    SCOPED_TRACE(ground ? "ground range" : "slant range");
    ScratchJob job(ground ? "ws_uniform_ground" : "ws_uniform_slant");
    auto a = ws_args(job, *truth_);
    if (ground) a[11] = "OK";
    const std::string list = job.layout(a, "WS");
    // The work files stay: their headers place the seams.
    set_parameters(job.dir() / "des" / "parameters_multilook.hdr", {{"DeleteTempFile", "0"}});
    const RunResult r = job.run("main_focussing_asar_WS#" + list);
    ASSERT_EQ(r.status, 0) << r.err << job.log();
    const Image im = read_image(job.dir() / "out" / (ground ? "scene_gr" : "scene_pwr"), ground);
    check_uniform(measure_uniform(im, *truth_, job.dir() / "out", 19207680.0, !ground), ground ? "ground_" : "slant_");
  }
}

}  // namespace
}  // namespace sar::test

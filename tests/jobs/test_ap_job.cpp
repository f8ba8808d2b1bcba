// The alternating polarisation job end to end through the focussing executable, on simulated
// products of each sub-mode with one target that only the first polarisation sees, one that
// only the second sees and one that both see. Each image must hold its own targets where
// their zero-Doppler times and ranges put them, nothing of the other polarisation's target,
// the grating lobes the block gating of the echoes predicts, and half the energy an image
// mode acquisition of the same scene gives.
#include <gtest/gtest.h>

#include <cmath>
#include <complex>
#include <cstring>
#include <regex>

#include "analyser/irf.hpp"
#include "base/errors.hpp"
#include "base/profile.hpp"
#include "job_harness.hpp"
#include "test_standalone_support.hpp"
#include "jobs/im_job.hpp"
#include "simulator/simulator.hpp"

using namespace sar::test;
namespace sim = sar::simulator;

namespace {

constexpr double kFs = 19207680.0;
constexpr int kLines = 4200;
constexpr int kSamples = 1400;
// The box of a target's energy: its main lobe, the grating lobes of the first three orders and
// the range sidelobes that matter.
constexpr int kEnergyLines = 14, kEnergySamples = 8;

struct Image {
  int lines = 0, samples = 0;
  double firstLine = 0.0, firstSample = 0.0;
  std::vector<std::complex<float>> data;

  sar::analyser::ComplexImageView view() const { return {data, lines, samples, samples, 0, 0}; }
  double energy(double line, double sample) const {
    double e = 0.0;
    const int l0 = static_cast<int>(std::lround(line)), s0 = static_cast<int>(std::lround(sample));
    for (int l = l0 - kEnergyLines; l <= l0 + kEnergyLines; ++l)
      for (int s = s0 - kEnergySamples; s <= s0 + kEnergySamples; ++s)
        if (l >= 0 && l < lines && s >= 0 && s < samples) e += std::norm(data[static_cast<std::size_t>(l) * samples + s]);
    return e;
  }
  double peak_near(double line, double sample, int radius) const {
    double best = 0.0;
    const int l0 = static_cast<int>(std::lround(line)), s0 = static_cast<int>(std::lround(sample));
    for (int l = l0 - radius; l <= l0 + radius; ++l)
      for (int s = s0 - radius; s <= s0 + radius; ++s)
        if (l >= 0 && l < lines && s >= 0 && s < samples)
          best = std::max(best, static_cast<double>(std::abs(data[static_cast<std::size_t>(l) * samples + s])));
    return best;
  }
};

// Three targets: the first polarisation only, the second only, both.
sim::SimulationConfig scene(sim::AcquisitionMode mode, const fs::path& dir) {
  sim::SimulationConfig c;
  c.mode = mode;
  c.out_dir = dir.string();
  c.lines = kLines;
  c.samples = kSamples;
  c.noise_db = -10.0;
  c.targets = {{{45.000, 10.000, 0.0}, 30.0, {1.0, 0.0}},
               {{45.010, 10.020, 0.0}, 30.0, {0.0, 1.0}},
               {{44.991, 9.985, 0.0}, 30.0, {1.0, 1.0}}};
  c.ins_template = kInsTemplate;
  c.xca_template = kXcaTemplate;
  return c;
}

// Focuses `t` with the job of `mode` ("IM" or "AP") and reads back every image it wrote, in
// the order the log names them.
std::vector<Image> focus(ScratchJob& job, const sim::SimulationTruth& t, const std::string& mode,
                         const std::vector<std::string>& stems) {
  const std::string root = (job.dir() / "out").string();
  const std::string list = job.layout({t.level0_path, t.orbit_path, t.ins_path, t.xca_path, root, "256", "256", "NotOK",
                                       "NotOK", "NotOK", "NotOK", "NotOK", "OK", "1.0"},
                                      mode);
  set_parameters(job.dir() / "des" / ("parameters_" + mode + ".hdr"),
                 {{"LinesInBlock", "4096"},
                  {"AzimuthOverlap", "1280"},
                  {"SamplesInBlock", "1024"},
                  {"RangeOverlap", "256"},
                  {"RangeWindowHammingParameter", "0"},
                  {"AzimuthWindowHammingParameter", "0"},
                  {"Azblk", "1000"},
                  {"Flag_incore", "1"}});
  const RunResult r = job.run("main_focussing_asar_" + mode + "#" + list);
  EXPECT_EQ(r.status, 0) << r.err << job.log();
  std::vector<Image> images;
  if (r.status != 0) return images;
  const std::string log = job.log();
  const std::regex slcLine("SLC: ([0-9]+) lines of ([0-9]+) samples, first line ([-0-9.e+]+) s, first sample ([-0-9.e+]+) s");
  auto it = std::sregex_iterator(log.begin(), log.end(), slcLine);
  for (const std::string& stem : stems) {
    if (it == std::sregex_iterator()) {
      ADD_FAILURE() << "no SLC line in the log for " << stem;
      break;
    }
    const std::smatch m = *it;
    ++it;
    Image im;
    im.lines = std::stoi(m[1]);
    im.samples = std::stoi(m[2]);
    im.firstLine = std::stod(m[3]);
    im.firstSample = std::stod(m[4]);
    const std::string bytes = slurp(root + stem + "_slc");
    EXPECT_EQ(bytes.size(), static_cast<std::size_t>(im.lines) * im.samples * 8) << stem;
    im.data.resize(bytes.size() / 8);
    std::memcpy(im.data.data(), bytes.data(), im.data.size() * 8);
    images.push_back(std::move(im));
  }
  return images;
}

struct ApRow {
  const char* name;
  sim::AcquisitionMode mode;
  bool archiveName;  // "ASA_AP__0P", the sub-mode told by the packets
  std::array<const char*, 2> words;
  bool againstIm;    // compare the energy with an IM acquisition of the same scene
};

void PrintTo(const ApRow& row, std::ostream* os) { *os << row.name; }

class ApJob : public ::testing::TestWithParam<ApRow> {};

TEST_P(ApJob, EachPolarisationInItsOwnImage) {
  const ApRow& row = GetParam();
  ScratchJob job(std::string("ap_") + row.name);
  sim::SimulationConfig c = scene(row.mode, job.dir() / "inputs");
  c.ap.generic_name = row.archiveName;
  const sim::SimulationTruth t = sim::run_simulation(c);
  if (row.archiveName) {
    ASSERT_EQ(fs::path(t.level0_path).filename().string().substr(0, 10), "ASA_AP__0C");
  }

  const std::vector<std::string> stems = {std::string("_") + row.words[0], std::string("_") + row.words[1]};
  EXPECT_EQ(sar::jobs::ap_images(t.level0_path), (std::vector<std::string>{row.words[0], row.words[1]}));
  const std::vector<Image> images = focus(job, t, "AP", stems);
  ASSERT_EQ(images.size(), 2u);

  // Both images on one line grid: same size, first line and first sample.
  EXPECT_EQ(images[0].lines, images[1].lines);
  EXPECT_EQ(images[0].samples, images[1].samples);
  EXPECT_DOUBLE_EQ(images[0].firstLine, images[1].firstLine);
  EXPECT_DOUBLE_EQ(images[0].firstSample, images[1].firstSample);
  for (const std::string& stem : stems) {
    const std::string base = (job.dir() / "out").string() + stem + "_slc";
    for (const char* suffix : {"_hdr", ".hdr", ".sml", ".tif", ".kml"})
      EXPECT_TRUE(fs::exists(base + suffix)) << base + suffix;
    // Both images tell the same line interval, and the looks that average the lobes.
    std::vector<double> interval(1);
    sar::base::GetCheckMyProfileDoubleArray("Processing", "AzimuthTimeStep", interval, base + "_hdr");
    EXPECT_NEAR(interval[0], 1.0 / t.prf, 1e-12);
    EXPECT_GE(sar::base::GetCheckMyProfileInt("Processing", "SuggestedAzimuthLooks", base + "_hdr"), 7);
    sar::base::FreeProfile(base + "_hdr");
  }

  const double L = t.channels.at(0).burst_echoes;
  for (std::size_t k = 0; k < t.targets.size(); ++k) {
    const sim::TargetTruth& target = t.targets[k];
    std::array<double, 2> own{};  // peak amplitude of the target in each image that sees it
    for (std::size_t i = 0; i < 2; ++i) {
      SCOPED_TRACE("target " + std::to_string(k) + " in image " + row.words[i]);
      const Image& im = images[i];
      const double line = (target.zero_doppler_time - im.firstLine) * t.prf;
      const double sample = (target.range_time - im.firstSample) * kFs;
      ASSERT_GT(line, 100);
      ASSERT_LT(line, im.lines - 100);
      if (target.target.channel_gain[i] == 0.0) continue;
      const auto irf = sar::analyser::measure_point(im.view(), line, sample, {});
      ASSERT_TRUE(irf.valid) << irf.problem;
      EXPECT_NEAR(irf.peak_line, line, 0.2);
      EXPECT_NEAR(irf.peak_sample, sample, 0.2);
      std::printf("%s image %s target %zu: d line %+.3f d sample %+.3f, widths az %.3f rg %.3f px, PSLR az %.2f rg "
                  "%.2f dB\n",
                  row.name, row.words[i], k, irf.peak_line - line, irf.peak_sample - sample, irf.res_az_px,
                  irf.res_rg_px, irf.pslr_az_db, irf.pslr_rg_db);
      own[i] = irf.amplitude;

      // The echoes of one polarisation come in blocks of L lines, one block of each in a cycle
      // of 2 L: the azimuth signal is the IM one gated by that square wave, whose first
      // harmonics (2 / pi of the mean each) focus PRF^2 / (2 L Ka) lines either side.
      const double offset = t.prf * t.prf / (2.0 * L * std::fabs(target.doppler_rate));
      sar::analyser::AnalyserOptions near;
      near.search_radius = 1;
      for (const double side : {-1.0, 1.0}) {
        const auto lobe = sar::analyser::measure_point(im.view(), line + side * offset, sample, near);
        ASSERT_TRUE(lobe.valid) << lobe.problem;
        const double level = 20.0 * std::log10(lobe.amplitude / irf.amplitude);
        std::printf("%s image %s target %zu: grating lobe at %+.2f lines (predicted %+.2f), %.2f dB\n", row.name,
                    row.words[i], k, lobe.peak_line - irf.peak_line, side * offset, level);
        EXPECT_NEAR(lobe.peak_line - irf.peak_line, side * offset, 0.3);
        EXPECT_NEAR(level, 20.0 * std::log10(2.0 / 3.14159265358979), 1.5);
      }
    }
    // A target that one polarisation does not see leaves nothing in its image.
    for (std::size_t i = 0; i < 2; ++i) {
      if (target.target.channel_gain[i] != 0.0) continue;
      const std::size_t other = 1 - i;
      const Image& im = images[i];
      const double line = (target.zero_doppler_time - im.firstLine) * t.prf;
      const double sample = (target.range_time - im.firstSample) * kFs;
      const double leak = 20.0 * std::log10(im.peak_near(line, sample, 2) / own[other]);
      std::printf("%s target %zu: %.1f dB in image %s, which does not see it\n", row.name, k, leak, row.words[i]);
      EXPECT_LT(leak, -40.0);
    }
  }

  if (!row.againstIm) return;
  // The same scene acquired in image mode: every echo line holds signal where AP holds one in
  // two, so each AP image carries half the energy.
  ScratchJob imJob(std::string("ap_im_") + row.name);
  sim::SimulationConfig ci = scene(sim::AcquisitionMode::kIM, imJob.dir() / "inputs");
  const sim::SimulationTruth ti = sim::run_simulation(ci);
  const std::vector<Image> im = focus(imJob, ti, "IM", {""});
  ASSERT_EQ(im.size(), 1u);
  for (std::size_t k = 0; k < t.targets.size(); ++k) {
    const double imLine = (ti.targets[k].zero_doppler_time - im[0].firstLine) * ti.prf;
    const double imSample = (ti.targets[k].range_time - im[0].firstSample) * kFs;
    const double reference = im[0].energy(imLine, imSample);
    for (std::size_t i = 0; i < 2; ++i) {
      if (t.targets[k].target.channel_gain[i] == 0.0) continue;
      const double line = (t.targets[k].zero_doppler_time - images[i].firstLine) * t.prf;
      const double sample = (t.targets[k].range_time - images[i].firstSample) * kFs;
      const double gain = t.channels[i].target_gain;
      const double ratio = images[i].energy(line, sample) / (reference * gain * gain);
      std::printf("%s target %zu image %s: energy %.3f of the IM image's\n", row.name, k, row.words[i], ratio);
      EXPECT_NEAR(ratio, 0.5, 0.05);
    }
  }
}

INSTANTIATE_TEST_SUITE_P(SubModes, ApJob,
                         ::testing::Values(ApRow{"aph", sim::AcquisitionMode::kAPH, false, {"hv", "hh"}, false},
                                           ApRow{"apc", sim::AcquisitionMode::kAPC, false, {"vv", "hh"}, true},
                                           ApRow{"apv_archive_name", sim::AcquisitionMode::kAPV, true, {"vv", "vh"},
                                                 false}),
                         [](const auto& info) { return std::string(info.param.name); });

}  // namespace

namespace {

// The product names and types the AP job takes and refuses, with the images they give.
TEST(ApJobProducts, NamesAndTypesGiveTheImagesOrTheRefusal) {
  ScratchJob job("ap_names");
  struct Row {
    const char* name;
    sim::AcquisitionMode mode;
    bool archiveName;
    std::vector<std::string> words;  // empty: refused with "ASA_AP0"
  };
  const Row rows[] = {
      {"APH", sim::AcquisitionMode::kAPH, false, {"hv", "hh"}},
      {"APV", sim::AcquisitionMode::kAPV, false, {"vv", "vh"}},
      {"APC", sim::AcquisitionMode::kAPC, false, {"vv", "hh"}},
      {"ASA_AP__0P of APH packets", sim::AcquisitionMode::kAPH, true, {"hv", "hh"}},
      {"ASA_AP__0P of APC packets", sim::AcquisitionMode::kAPC, true, {"vv", "hh"}},
      {"image mode", sim::AcquisitionMode::kIM, false, {}},
      {"wide swath", sim::AcquisitionMode::kWS, false, {}},
  };
  for (const Row& row : rows) {
    SCOPED_TRACE(row.name);
    sim::SimulationConfig c;
    c.mode = row.mode;
    c.out_dir = (job.dir() / row.name).string();
    c.lines = 800;
    c.samples = 600;
    c.ap.generic_name = row.archiveName;
    c.targets = {{{45.0, 10.0, 0.0}, 30.0}};
    const sim::SimulationTruth t = sim::run_simulation(c);
    try {
      EXPECT_EQ(sar::jobs::ap_images(t.level0_path), row.words);
      EXPECT_FALSE(row.words.empty()) << "taken";
    } catch (const sar::base::CErrorExceptionManager& e) {
      EXPECT_TRUE(row.words.empty()) << "refused: " << e.detail();
      EXPECT_EQ(e.ec(), sar::base::ec::kBadArguments);
      EXPECT_EQ(e.detail(), "ASA_AP0");
    }
  }
  // Real auxiliary products are no AP products either.
  for (const std::string& path : {kIns, kXca}) {
    SCOPED_TRACE(path);
    EXPECT_THROW(sar::jobs::ap_images(path), sar::base::CErrorExceptionManager);
  }
}

}  // namespace

namespace {

// sarfocus ap: the standalone command line focuses both images into the output folder, its
// marker lists both, and a second run with --skip-complete finds them complete.
TEST(ApJobProducts, SarfocusApWritesBothImages) {
  ScratchJob job("sarfocus_ap");
  sim::SimulationConfig c;
  c.mode = sim::AcquisitionMode::kAPH;
  c.out_dir = (job.dir() / "in").string();
  c.lines = 2000;
  c.samples = 1200;
  c.noise_db = -10.0;
  c.targets = {{{45.0, 10.0, 0.0}, 30.0}};
  c.ins_template = kInsTemplate;
  c.xca_template = kXcaTemplate;
  const sim::SimulationTruth t = sim::run_simulation(c);
  const fs::path out = job.dir() / "out";
  std::vector<std::string> args = {"ap", t.level0_path, "--orbit", t.orbit_path, "--aux", c.out_dir,
                                   "--out", out.string(), "--quicklook", "128x128"};
  for (const std::string& p : kSmallSceneParams) {
    args.push_back("--param");
    args.push_back(p);
  }
  const CliResult r = sarfocus(args);
  ASSERT_EQ(r.status, 0) << r.err;
  const std::string stem = fs::path(t.level0_path).stem().string();
  for (const char* word : {"_hv", "_hh"})
    for (const char* suffix : {"_slc", "_slc_hdr", "_slc.sml", "_slc.tif"})
      EXPECT_TRUE(fs::exists(out / (stem + word + suffix))) << stem + word + suffix;
  EXPECT_NE((r.out + r.err).find(stem + "_hv_slc"), std::string::npos) << r.out << r.err;
  args.push_back("--skip-complete");
  const CliResult again = sarfocus(args);
  EXPECT_EQ(again.status, 0) << again.err;
  EXPECT_NE((again.out + again.err).find("skipped"), std::string::npos) << again.out << again.err;
}

}  // namespace

// The Doppler centroid and the azimuth blocks of the IM job on scenes where they are hard to
// get right, through the focussing executable. Every row asserts the annotated centroid across
// the whole swath against the simulator's beam-centre centroid, the applied ambiguity, where
// the centroid came from (the fitted surface, one constant from all signal blocks, or the
// geometry), and that every point target comes out with the azimuth width and sidelobes the
// processed band predicts: a wrong centroid moves the band off the antenna pattern and widens
// the response, and a block that cuts an aperture widens it too.
//
// Calm seas hold point targets and noise alone: blocks that each see part of an aperture give
// centroids a fit turns into an impossible range slope. The geometry here knows the yaw law but
// not the squint or the yaw bias of the scene, so it is off by the squint.
#include <gtest/gtest.h>

#include <cmath>
#include <cstdio>
#include <cstring>
#include <fstream>
#include <optional>
#include <regex>

#include "analyser/irf.hpp"
#include "base/profile.hpp"
#include "geometry/orbit_file.hpp"
#include "geometry/orbit_interp.hpp"
#include "irf_theory.hpp"
#include "job_harness.hpp"
#include "simulator/clutter.hpp"
#include "simulator/simulator.hpp"

using namespace sar::test;
namespace sim = sar::simulator;

namespace {

constexpr double kPrf = 1652.4156916724;
constexpr double kFs = 19207680.0;

enum class Source { Any, Fit, Constant, Geometry };
const char* source_name(Source s) {
  switch (s) {
    case Source::Fit: return "FIT";
    case Source::Constant: return "CONSTANT";
    case Source::Geometry: return "GEOMETRY";
    default: return "any";
  }
}

struct Row {
  const char* name;
  std::optional<double> centroidPrf;  // beam squinted to this centroid at the scene centre
  double yawBiasDeg = 0.0;            // or a yaw error on top of the law
  double clutterDb = -200.0;
  double noiseDb = -6.0;
  int lines = 6144;
  Source source = Source::Any;
  bool alongTrack = false;      // targets every 0.006 degree (some 160 lines) along the scene: on and around every block seam
  bool noTargets = false;       // noise alone
  double brightAmplitude = 0.0;  // one target this bright (the others at 20)
  std::vector<std::pair<std::string, std::string>> parameters;  // extra parameter overrides
};

void PrintTo(const Row& row, std::ostream* os) { *os << row.name; }

struct Outcome {
  std::vector<double> centroidError;  // annotated minus true, Hz, at near, mid and far range
  std::vector<double> centroidTrue;   // the beam centre's, Hz, there
  std::vector<double> widthError;     // relative azimuth width error of each measured target
  std::vector<double> pslrError;      // dB
  std::string source, failed;
  int ambiguity = 0, trueAmbiguity = 0;
  std::string slcBytes;  // the SLC, for comparing runs
};

sim::SimulationConfig scene_of(const Row& row, const fs::path& dir) {
  sim::SimulationConfig c;
  c.out_dir = dir.string();
  c.lines = row.lines;
  c.samples = 2400;
  c.noise_db = row.clutterDb > -100.0 ? 0.0 : row.noiseDb;
  c.attitude.yaw_steering = true;
  c.attitude.yaw_bias_rad = row.yawBiasDeg * kPi / 180.0;
  if (row.centroidPrf) c.centroid_hz = *row.centroidPrf * kPrf;
  c.clutter.power_db = row.clutterDb;
  const double amp = row.noTargets ? 0.0 : 20.0;
  if (row.alongTrack) {
    // The scene is centred on the first target's beam-centre crossing, which a squint puts
    // seconds before (positive centroid) or after its zero-Doppler time: the others follow on
    // the side where the focused lines are, about 160 lines apart, at three ranges.
    const double side = row.centroidPrf.value_or(0.0) >= 0.0 ? 1.0 : -1.0;
    for (int k = 0; k < 16; ++k)
      c.targets.push_back({{45.0 + side * 0.006 * k, 10.0 + 0.02 * ((k % 3) - 1), 0.0}, amp});
  } else {
    c.targets = {{{45.0, 10.0, 0.0}, row.brightAmplitude > 0.0 ? row.brightAmplitude : amp},
                 {{45.05, 10.02, 0.0}, amp},
                 {{44.96, 9.99, 0.0}, amp},
                 {{45.02, 10.06, 0.0}, amp}};
  }
  c.ins_template = kInsTemplate;
  c.xca_template = kXcaTemplate;
  return c;
}

// Focuses the row's scene (simulated once into `inputs`) and measures it.
Outcome focus(const Row& row, const sim::SimulationConfig& c, const sim::SimulationTruth& t,
              const std::string& tag, bool core) {
  Outcome o;
  ScratchJob inner(std::string("centroid_") + row.name + "_" + tag);
  const std::string root = (inner.dir() / "out").string();
  const std::string list = inner.layout({t.level0_path, t.orbit_path, t.ins_path, t.xca_path, root, "256", "256", "NotOK",
                                         "NotOK", "NotOK", "NotOK", "NotOK", "NotOK", "1.0"});
  std::vector<std::pair<std::string, std::string>> p = {
      {"LinesInBlock", "4096"},          {"AzimuthOverlap", "1280"},
      {"SamplesInBlock", "1024"},        {"RangeOverlap", "256"},
      {"RangeWindowHammingParameter", "0"}, {"AzimuthWindowHammingParameter", "0"},
      {"Azblk", "1000"},                 {"Flag_incore", core ? "1" : "0"}};
  for (const auto& kv : row.parameters) p.push_back(kv);
  set_parameters(inner.dir() / "des" / "parameters_IM.hdr", p);
  const RunResult r = inner.run("main_focussing_asar_IM#" + list);
  EXPECT_EQ(r.status, 0) << r.err << inner.log();
  if (r.status != 0) return o;
  const std::string log = inner.log();
  std::smatch m;
  if (std::regex_search(log, m, std::regex("Doppler centroid from the ([a-z ]+)"))) {
    const std::string from = m[1];
    o.source = from.find("fitted") == 0 ? "FIT" : from.find("one constant") == 0 ? "CONSTANT" : "GEOMETRY";
  }
  if (std::regex_search(log, m, std::regex("\\(([a-z ]+) check: ([^\n]*)\\)\n"))) o.failed = std::string(m[1]) + ": " + std::string(m[2]);

  // The annotated centroid across the swath against the beam centre's, at the middle line.
  const std::string hdr = root + "_slc_hdr";
  std::vector<double> coef(3), ref(1);
  sar::base::GetCheckMyProfileDoubleArray("Processing", "DopCenRangeCoeff", coef, hdr);
  sar::base::GetCheckMyProfileDoubleArray("Processing", "DopCenRgRefTime", ref, hdr);
  sar::base::FreeProfile(hdr);
  const sim::ClutterGeometry g = sim::clutter_geometry(c, t);
  for (const double x : {0.0, 0.5, 1.0}) {
    const double tau = t.near_range_time + x * (c.samples - 1) / kFs;
    const double dt = tau - ref[0];
    const double annotated = coef[0] + coef[1] * dt + coef[2] * dt * dt;
    o.centroidError.push_back(annotated - g.doppler_centroid(tau));
    o.centroidTrue.push_back(g.doppler_centroid(tau));
  }
  o.trueAmbiguity = static_cast<int>(std::lround(g.doppler_centroid(t.near_range_time + 0.5 * c.samples / kFs) / kPrf));
  o.ambiguity = static_cast<int>(std::lround(coef[0] / kPrf));

  // Every target inside the SLC, against the theory of the whole PRF under the two-way pattern.
  if (!std::regex_search(log, m, std::regex("SLC: ([0-9]+) lines of ([0-9]+) samples, first line ([-0-9.e+]+) s, "
                                            "first sample ([-0-9.e+]+) s"))) {
    ADD_FAILURE() << log;
    return o;
  }
  const int lines = std::stoi(m[1]), samples = std::stoi(m[2]);
  const double firstLine = std::stod(m[3]), firstSample = std::stod(m[4]);
  o.slcBytes = slurp(root + "_slc");
  if (o.slcBytes.size() != static_cast<std::size_t>(lines) * samples * 8) {
    ADD_FAILURE() << "SLC of " << o.slcBytes.size() << " bytes";
    return o;
  }
  std::vector<std::complex<float>> image(static_cast<std::size_t>(lines) * samples);
  std::memcpy(image.data(), o.slcBytes.data(), o.slcBytes.size());
  const sar::analyser::ComplexImageView view{image, lines, samples, samples, 0, 0};
  const sar::geometry::OrbitData orbit = sar::geometry::read_orbit(t.orbit_path);
  for (const auto& target : t.targets) {
    if (target.target.amplitude <= 0.0) continue;
    const double line = (target.zero_doppler_time - firstLine) * t.prf;
    const double sample = (target.range_time - firstSample) * kFs;
    if (line < 40 || line > lines - 40 || sample < 40 || sample > samples - 40) continue;
    const auto irf = sar::analyser::measure_point(view, line, sample, {});
    EXPECT_TRUE(irf.valid) << irf.problem;
    if (!irf.valid) continue;
    const double speed = sar::geometry::norm(sar::geometry::orbit_state_at(orbit, target.zero_doppler_time).velocity);
    const Lobes theory = azimuth_theory(t.prf, speed, 10.0);
    std::printf("%s/%s: target at line %.1f sample %.1f: az %.3f px (theory %.3f) PSLR az %.2f dB (%.2f)\n", row.name,
                tag.c_str(), line, sample, irf.res_az_px, theory.width, irf.pslr_az_db, theory.pslr);
    EXPECT_NEAR(irf.peak_line, line, 0.2);
    o.widthError.push_back(irf.res_az_px / theory.width - 1.0);
    o.pslrError.push_back(irf.pslr_az_db - theory.pslr);
  }
  return o;
}

class CentroidTable : public ::testing::TestWithParam<Row> {};

TEST_P(CentroidTable, CentroidAmbiguityAndApertures) {
  const Row& row = GetParam();
  ScratchJob job(std::string("centroid_") + row.name);
  const sim::SimulationConfig c = scene_of(row, job.dir() / "inputs");
  const sim::SimulationTruth t = sim::run_simulation(c);
  const Outcome o = focus(row, c, t, "core", true);
  ASSERT_EQ(o.centroidError.size(), 3u);
  std::printf("%s: true centroid near %.1f mid %.1f far %.1f Hz; annotated minus true %+.1f %+.1f %+.1f Hz; ambiguity "
              "%d (true %d); from %s%s%s\n",
              row.name, o.centroidTrue[0], o.centroidTrue[1], o.centroidTrue[2], o.centroidError[0], o.centroidError[1],
              o.centroidError[2], o.ambiguity, o.trueAmbiguity, o.source.c_str(),
              o.failed.empty() ? "" : " after the check of ", o.failed.c_str());
  if (row.source != Source::Any) {
    EXPECT_EQ(o.source, source_name(row.source));
  }
  if (row.source != Source::Geometry) {
    for (const double e : o.centroidError) EXPECT_LT(std::fabs(e), 30.0) << "annotated centroid off the truth";
    EXPECT_EQ(o.ambiguity, o.trueAmbiguity);
  }
  if (!row.noTargets) {
    EXPECT_GE(o.widthError.size(), row.alongTrack ? 6u : 3u) << "targets measured";
  }
  for (std::size_t i = 0; i < o.widthError.size(); ++i) {
    EXPECT_LT(std::fabs(o.widthError[i]), 0.10) << "azimuth width of target " << i;
    EXPECT_LT(std::fabs(o.pslrError[i]), 1.5) << "azimuth PSLR of target " << i;
  }
  if (row.alongTrack) {
    // The blocks are cut the same way in file mode: the same SLC bytes.
    const Outcome file = focus(row, c, t, "file", false);
    EXPECT_TRUE(file.slcBytes == o.slcBytes) << "file mode and core mode differ";
  }
}

// One row: a scene and what must come of it.
Row row(const char* name, std::optional<double> centroidPrf, double clutterDb, Source source) {
  Row r;
  r.name = name;
  r.centroidPrf = centroidPrf;
  r.clutterDb = clutterDb;
  r.source = source;
  return r;
}

const std::vector<Row>& rows() {
  static const std::vector<Row> table = [] {
    std::vector<Row> t;
    t.push_back(row("calm_sea_0p10_prf", 0.10, -200.0, Source::Any));
    t.push_back(row("calm_sea_0p65_prf", 0.65, -200.0, Source::Constant));
    t.push_back(row("calm_sea_1p4_prf_seams", 1.4, -200.0, Source::Any));
    t.back().alongTrack = true;
    t.push_back(row("clutter_minus_1p1_prf_seams", -1.1, 25.0, Source::Fit));
    t.back().alongTrack = true;
    t.push_back(row("clutter_plus_3_prf_seams", 3.0, 25.0, Source::Fit));
    t.back().alongTrack = true;
    t.back().lines = 8192;
    t.push_back(row("clutter_yaw_bias_range_slope", std::nullopt, 25.0, Source::Fit));
    t.back().yawBiasDeg = 0.8;
    t.push_back(row("bright_target_weak_clutter", 0.3, 5.0, Source::Any));
    t.back().brightAmplitude = 100.0;
    t.push_back(row("noise_alone", std::nullopt, -200.0, Source::Geometry));
    t.back().noTargets = true;
    return t;
  }();
  return table;
}

INSTANTIATE_TEST_SUITE_P(Scenes, CentroidTable, ::testing::ValuesIn(rows()),
                         [](const ::testing::TestParamInfo<Row>& info) { return std::string(info.param.name); });

// The table has teeth: with the range slope bound twenty times too wide and the scatter check
// open, the calm sea's blocks make a surface that moves the band off the targets.
TEST(CentroidTableControl, OpenChecksLetTheCalmSeaFail) {
  Row open = row("calm_sea_open_checks", 0.65, -200.0, Source::Fit);
  open.parameters = {{"AttitudeErrorBound", "20"}, {"CentroidScatterBound", "1e6"}};
  ScratchJob job("centroid_control");
  const sim::SimulationConfig c = scene_of(open, job.dir() / "inputs");
  const sim::SimulationTruth t = sim::run_simulation(c);
  const Outcome o = focus(open, c, t, "core", true);
  ASSERT_EQ(o.centroidError.size(), 3u);
  EXPECT_EQ(o.source, "FIT");
  double worstCentroid = 0.0, worstWidth = 0.0;
  for (const double e : o.centroidError) worstCentroid = std::max(worstCentroid, std::fabs(e));
  for (const double e : o.widthError) worstWidth = std::max(worstWidth, std::fabs(e));
  std::printf("open checks: worst centroid error %.1f Hz, worst azimuth width error %.1f %%\n", worstCentroid,
              100.0 * worstWidth);
  EXPECT_TRUE(worstCentroid > 30.0 || worstWidth > 0.10);
}

}  // namespace

// The whole estimator on simulated image mode scenes: centroid, range slope, ambiguity and the
// estimator that decided it, as the result file tells them.
#include <gtest/gtest.h>

#include <cmath>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <limits>
#include <string>
#include <vector>

#include "base/profile.hpp"
#include "doppler/dcest.hpp"
#include "test_support.hpp"

namespace sar::doppler {
namespace {

using testing::SceneSpec;

struct TempDir {
  std::filesystem::path path;
  explicit TempDir(const char* name) {
    path = std::filesystem::path(SAR_BINARY_DIR) / "doppler_test" / name;
    std::filesystem::create_directories(path);
  }
  std::string resume() const { return (path / "DCEST_resume.txt").string(); }
};

struct Outcome {
  int status = 0;
  DopplerPoly poly{};
  dcestconf conf;
  dcimage image;
  double centre = 0.0;  // Hz at the scene centre
  double slope = 0.0;   // Hz/s at the scene centre
};

Outcome estimate(const SceneSpec& shape, std::span<const fcomplex> scene, dcestconf conf, const TempDir& dir) {
  Outcome o;
  o.image = testing::image_of(shape);
  conf.coreMatrix = scene;
  conf.outputDir = dir.path.string();
  o.status = getnadcpoly(o.image, conf, o.poly);
  const double r = testing::centre_range_time(o.image, conf.fs);
  o.centre = dceval(o.poly, r, testing::centre_azimuth_time(o.image));
  o.slope = testing::range_slope(o.poly, r);
  o.conf = std::move(conf);
  return o;
}

// Absolute centroids across the ambiguities met in image mode, on homogeneous scenes (WDAR must
// decide) and on scenes with bright point scatterers over the near half (MLBF must decide).
// The orbit prediction is deliberately one PRF off, so that a fallback to it shows.
TEST(DopplerScenes, CentroidSlopeAndAmbiguityOverTheTable) {
  const TempDir dir("table");
  const double kPrfs[] = {-2.3, -0.4, 0.1, 0.45, 0.9, 1.6, 2.7};
  for (const bool high : {false, true}) {
    for (const double prfs : kPrfs) {
      SceneSpec shape;
      shape.seed = high ? 11 : 5;
      shape.highContrast = high;
      shape.brightSpacing = 1024;
      shape.brightPower = 1000.0;
      // WDAR reads a slope of a few 1e-3 cycles over the range band: its block estimates
      // scatter by about a PRF, and blocks closer than an azimuth exposure share scatterers,
      // so the homogeneous scenes are larger.
      shape.lines = high ? 2048 : 4096;
      shape.samples = high ? 1024 : 4096;
      shape.centroid = prfs * shape.prf;
      shape.centroidSlope = -0.05;  // Hz per range sample
      const auto scene = testing::make_scene(shape);
      dcestconf conf = testing::estimator_config();
      conf.geometricCentroid = shape.centroid + shape.prf;
      const Outcome o = estimate(shape, scene, conf, dir);
      SCOPED_TRACE(testing::resume_text(dir.resume(), "Ambiguity_decision", "Decided_by") +
                   (high ? " high contrast, " : " low contrast, ") + std::to_string(prfs) + " PRF");
      ASSERT_EQ(o.status, 0);
      const double truth = shape.centroidAt(shape.samples / 2);
      const double trueSlope = shape.centroidSlope * conf.fs;
      std::printf("TABLE %-4s true %9.2f Hz (%5.2f PRF)  estimated %9.2f Hz  ambiguity %2d  by %s  slope %.4g / %.4g\n",
                  high ? "high" : "low", truth, prfs, o.centre, o.conf.ambiguity,
                  testing::resume_text(dir.resume(), "Ambiguity_decision", "Decided_by").c_str(), o.slope, trueSlope);
      // Fractional centroid and the ambiguity.
      EXPECT_LT(std::fabs(testing::wrap_half((o.centre - truth) / shape.prf)) * shape.prf, 10.0);
      EXPECT_LT(std::fabs(o.centre - truth), shape.prf / 2.0);
      // Range slope: right sign, within 20 %.
      EXPECT_GT(o.slope / trueSlope, 0.8);
      EXPECT_LT(o.slope / trueSlope, 1.2);

      // The result file names the estimator and holds its votes.
      const std::string path = dir.resume();
      EXPECT_EQ(testing::resume_int(path, "Ambiguity_decision", "Applied_ambiguity"), o.conf.ambiguity);
      EXPECT_EQ(testing::resume_int(path, "Estimated_polynomial", "Estimated_ambiguity"), o.conf.ambiguity);
      const auto amb = testing::resume_ints(path, "Ambiguity_decision", "Vote_ambiguities");
      const auto mlbf = testing::resume_ints(path, "Ambiguity_decision", "MLBF_votes");
      const auto wdar = testing::resume_ints(path, "Ambiguity_decision", "WDAR_votes");
      ASSERT_EQ(amb.size(), mlbf.size());
      ASSERT_EQ(amb.size(), wdar.size());
      int mlbfFor = 0, mlbfAll = 0, wdarAll = 0;
      for (std::size_t i = 0; i < amb.size(); ++i) {
        mlbfAll += mlbf[i];
        wdarAll += wdar[i];
        if (amb[i] == o.conf.ambiguity) mlbfFor = mlbf[i];
      }
      const int estimates = testing::resume_int(path, "MLBF_ambiguity_estimation", "MLBF_bins_processed") *
                            testing::resume_int(path, "MLBF_ambiguity_estimation", "MLBF_estimates_per_bin");
      EXPECT_EQ(wdarAll, testing::resume_int(path, "WDAR_ambiguity_estimation", "WDAR_bins_processed"));
      if (high) {
        EXPECT_EQ(testing::resume_text(path, "Ambiguity_decision", "Decided_by"), "MLBF");
        // Most beat estimates name the applied ambiguity.
        EXPECT_GT(2 * mlbfFor, estimates);
        EXPECT_EQ(testing::resume_int(path, "MLBF_ambiguity_estimation", "MLBF_estimated_ambiguity"), o.conf.ambiguity);
      } else {
        EXPECT_EQ(testing::resume_text(path, "Ambiguity_decision", "Decided_by"), "WDAR");
        // Homogeneous clutter has no beat peak worth a vote.
        EXPECT_LT(4 * mlbfAll, estimates);
        EXPECT_GE(wdarAll, 30);
        const double mean = testing::resume_double(path, "WDAR_ambiguity_estimation", "Mean_of_good_WDAR_estimates");
        EXPECT_EQ(round_half_away(mean), o.conf.ambiguity);
        EXPECT_EQ(testing::resume_text(path, "WDAR_ambiguity_estimation", "WDAR_offset_frequency"), "NOT_AVAILABLE");
      }
    }
  }
  testing::clear_reflectivity_cache();
}

// One small scene for the tests of configuration and bad input.
const SceneSpec& small_spec() {
  static const SceneSpec shape = [] {
    SceneSpec s;
    s.seed = 21;
    s.lines = 2048;
    s.samples = 1024;
    s.centroid = 1.6 * s.prf;
    s.centroidSlope = -0.05;
    return s;
  }();
  return shape;
}
const std::vector<fcomplex>& small_scene() {
  static const std::vector<fcomplex> scene = testing::make_scene(small_spec());
  return scene;
}

TEST(DopplerScenes, AmbiguityFlagSelectsTheAnswer) {
  const TempDir dir("flags");
  const SceneSpec& shape = small_spec();
  const double truth = shape.centroidAt(shape.samples / 2);
  dcestconf conf = testing::estimator_config();
  conf.geometricCentroid = truth + 0.2 * shape.prf;

  conf.Amb_flag = 0;
  const Outcome none = estimate(shape, small_scene(), conf, dir);
  ASSERT_EQ(none.status, 0);
  EXPECT_EQ(none.conf.ambiguity, 0);
  EXPECT_EQ(none.conf.decision, AmbiguityDecision::None);
  // No ambiguity: the centroid stays on the fractional branch of the plane search.
  EXPECT_LT(std::fabs(none.centre / shape.prf), 1.0);
  EXPECT_LT(std::fabs(testing::wrap_half((none.centre - truth) / shape.prf)) * shape.prf, 10.0);
  const std::string path = dir.resume();
  EXPECT_EQ(testing::resume_int(path, "Estimated_polynomial", "Estimated_ambiguity"), -99999);
  EXPECT_EQ(testing::resume_text(path, "MLBF_ambiguity_estimation", "MLBF_bins_processed"), "");
  EXPECT_EQ(testing::resume_text(path, "GEOM_ambiguity_estimation", "Geometry_estimated_ambiguity"), "");
  EXPECT_EQ(testing::resume_text(path, "Ambiguity_decision", "Decided_by"), "NONE");
  // The time origins of the polynomial are the image's, not zero.
  EXPECT_EQ(none.poly[7], testing::image_of(shape).rangeTimeOrigin);
  EXPECT_EQ(none.poly[8], testing::image_of(shape).azimuthTimeOrigin);
  EXPECT_NEAR(testing::resume_double(path, "Estimated_polynomial", "DC_time_origin_s"), none.poly[7], 1e-9);

  conf.Amb_flag = 2;
  const Outcome geo = estimate(shape, small_scene(), conf, dir);
  ASSERT_EQ(geo.status, 0);
  EXPECT_EQ(geo.conf.decision, AmbiguityDecision::Geometry);
  EXPECT_LT(std::fabs(geo.centre - truth), 10.0);
  EXPECT_EQ(geo.conf.ambiguity, round_half_away((geo.centre - none.centre) / shape.prf));
  EXPECT_EQ(testing::resume_int(path, "GEOM_ambiguity_estimation", "Geometry_estimated_ambiguity"), geo.conf.ambiguity);
  EXPECT_EQ(testing::resume_int(path, "Estimated_polynomial", "Estimated_ambiguity"), geo.conf.ambiguity);
  // The file is written anew: the estimators' sections of no run are left in it.
  EXPECT_EQ(testing::resume_text(path, "WDAR_ambiguity_estimation", "WDAR_bins_processed"), "");
  // The polynomial differs from the ambiguous one by whole PRFs in the constant term only.
  for (std::size_t i = 1; i < 9; ++i) EXPECT_DOUBLE_EQ(geo.poly[i], none.poly[i]) << i;

  for (const int bad : {-1, 3, 7}) {
    conf.Amb_flag = bad;
    EXPECT_EQ(estimate(shape, small_scene(), conf, dir).status, 10) << bad;
  }
  conf.Amb_flag = 1;
  conf.Nbestblocks = 0;
  EXPECT_EQ(estimate(shape, small_scene(), conf, dir).status, 10);
}

TEST(DopplerScenes, PureNoiseCannotBeDecided) {
  const TempDir dir("noise");
  SceneSpec shape;
  shape.noiseOnly = true;
  shape.lines = 4096;
  shape.samples = 2048;
  const auto scene = testing::make_scene(shape);
  dcestconf conf = testing::estimator_config();
  conf.geometricCentroid = 2.7 * shape.prf;

  // White noise has no lag-one correlation standing clear of its own floor: no block votes,
  // and the orbit geometry is applied, with the check that sent it there in the result file.
  // Accepting every block as valid (Sthr) changes nothing: validity is no signal.
  for (const double sthr : {conf.Sthr, 1e12}) {
    conf.Sthr = sthr;
    const Outcome o = estimate(shape, scene, conf, dir);
    ASSERT_EQ(o.status, 0);
    for (double a : o.poly) EXPECT_TRUE(std::isfinite(a));
    EXPECT_EQ(o.conf.gates.source, CentroidSource::Geometry);
    EXPECT_EQ(o.conf.gates.signalBlocks, 0);
    EXPECT_DOUBLE_EQ(o.centre, conf.geometricCentroid);
    const std::string path = dir.resume();
    EXPECT_EQ(testing::resume_text(path, "Centroid_plausibility", "Applied_centroid"), "GEOMETRY");
    EXPECT_EQ(testing::resume_text(path, "Centroid_plausibility", "Failed_check"), "signal blocks");
    EXPECT_EQ(testing::resume_text(path, "Ambiguity_decision", "Decided_by"), "GEOMETRY_FALLBACK");
  }
}

TEST(DopplerScenes, FileModeReadsTheSameImageInRowChunks) {
  const TempDir dir("file");
  const SceneSpec& shape = small_spec();
  const std::string file = (dir.path / "rgfoc.raw").string();
  {
    std::ofstream out(file, std::ios::binary | std::ios::trunc);
    out.write(reinterpret_cast<const char*>(small_scene().data()),
              static_cast<std::streamsize>(small_scene().size() * sizeof(fcomplex)));
  }
  dcestconf conf = testing::estimator_config();
  conf.geometricCentroid = shape.centroid;
  const Outcome core = estimate(shape, small_scene(), conf, dir);
  ASSERT_EQ(core.status, 0);

  conf.Flag_incore = 0;
  conf.Memory = conf.Blockl * shape.samples * 8;  // one block row at a time
  Outcome fileMode;
  fileMode.image = testing::image_of(shape);
  fileMode.image.path = file;
  conf.outputDir = dir.path.string();
  ASSERT_EQ(getnadcpoly(fileMode.image, conf, fileMode.poly), 0);
  EXPECT_EQ(conf.rowsInMemory, 1);
  for (std::size_t i = 0; i < 9; ++i) EXPECT_EQ(fileMode.poly[i], core.poly[i]) << i;
  EXPECT_EQ(conf.ambiguity, core.conf.ambiguity);

  // A file shorter than its description.
  std::filesystem::resize_file(file, small_scene().size() * sizeof(fcomplex) / 2);
  fileMode.image = testing::image_of(shape);
  fileMode.image.path = file;
  EXPECT_EQ(getnadcpoly(fileMode.image, conf, fileMode.poly), 2);
  fileMode.image.path = (dir.path / "absent.raw").string();
  EXPECT_EQ(getnadcpoly(fileMode.image, conf, fileMode.poly), 2);
}

TEST(DopplerScenes, FilledLinesOfNaNDoNotSpoilTheCentroid) {
  const TempDir dir("nan");
  const SceneSpec& shape = small_spec();
  dcestconf conf = testing::estimator_config();
  conf.geometricCentroid = shape.centroid;
  conf.Amb_flag = 2;  // the fractional centroid is under test here
  const Outcome clean = estimate(shape, small_scene(), conf, dir);
  ASSERT_EQ(clean.status, 0);

  // Missing lines filled with NaN: scattered lines, and a whole block row.
  std::vector<fcomplex> scene = small_scene();
  const float nan = std::numeric_limits<float>::quiet_NaN();
  auto blank = [&](int line) {
    for (int s = 0; s < shape.samples; ++s) scene[static_cast<std::size_t>(line) * shape.samples + s] = {nan, nan};
  };
  for (int l = 100; l < 2048; l += 97) blank(l);
  for (int l = 1024; l < 1536; ++l) blank(l);
  const Outcome o = estimate(shape, scene, conf, dir);
  ASSERT_EQ(o.status, 0);
  for (double a : o.poly) EXPECT_TRUE(std::isfinite(a));
  EXPECT_LT(std::fabs(o.centre - clean.centre), 10.0);
  int invalid = 0;
  for (const auto& b : o.conf.blocks) {
    EXPECT_TRUE(std::isfinite(b.centroid));
    invalid += b.valid ? 0 : 1;
  }
  EXPECT_EQ(invalid, o.conf.blocksAcross);  // the blanked block row
}

// An image narrower or shorter than one block has no grid to estimate on: the geometric
// centroid is applied, with a warning, never a singular fit. Too little memory for one block
// row is a configuration error.
TEST(DopplerScenes, ImagesTooSmallForOneBlockTakeTheGeometry) {
  const TempDir dir("small");
  const SceneSpec& shape = small_spec();
  dcestconf conf = testing::estimator_config();
  conf.Blocks = 2048;  // wider than the scene
  conf.Patchs = 64;
  conf.geometricCentroid = 321.5;
  Outcome o = estimate(shape, small_scene(), conf, dir);
  EXPECT_EQ(o.status, 0);
  EXPECT_EQ(o.conf.gates.source, CentroidSource::Geometry);
  EXPECT_DOUBLE_EQ(o.centre, 321.5);
  conf = testing::estimator_config();
  conf.geometricCentroid = -40.0;
  SceneSpec shortSpec = shape;
  shortSpec.lines = 300;  // shorter than a block
  o = estimate(shortSpec, std::span<const fcomplex>(small_scene()).first(300 * 1024), conf, dir);
  EXPECT_EQ(o.status, 0);
  EXPECT_EQ(o.conf.gates.failed, "block grid");
  EXPECT_DOUBLE_EQ(o.centre, -40.0);
  conf.Memory = 1000;  // not one block row
  EXPECT_EQ(estimate(shape, small_scene(), conf, dir).status, 1);
  conf = testing::estimator_config();
  conf.Blockl = 500;  // not a multiple of the patch
  EXPECT_EQ(estimate(shape, small_scene(), conf, dir).status, 10);
  conf = testing::estimator_config();
  EXPECT_EQ(estimate(shape, std::span<const fcomplex>(small_scene()).first(1000), conf, dir).status, 10);
}

}  // namespace
}  // namespace sar::doppler

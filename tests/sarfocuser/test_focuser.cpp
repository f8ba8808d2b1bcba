// Simulated RADARSAT-1 scenes through extraction and the raw-data focuser: point targets where
// their zero-Doppler times and ranges put them, with the widths and sidelobes the processed
// bands predict.
#include <gtest/gtest.h>

#include <cmath>
#include <complex>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <unistd.h>

#include "analyser/irf.hpp"
#include "geometry/geolocation.hpp"
#include "geometry/orbit_interp.hpp"
#include "radarsat/extract.hpp"
#include "sarfocuser/sarfocuser.hpp"
#include "simulator/rsat_product.hpp"

namespace fs = std::filesystem;
namespace rs = sar::simulator::rsat;
using namespace sar;

namespace {

struct Focused {
  fs::path dir;
  rs::RsatTruth truth;
  radarsat::Acquisition acq;
  std::unique_ptr<sarfocuser::SARFocuser> focuser;
  std::vector<std::complex<float>> slc;
  int status = -1;

  Focused(const std::string& name, rs::RsatConfig c, bool unweighted, double dcref = 0.0) {
    dir = fs::temp_directory_path() / ("rsat_focus_" + name + "_" + std::to_string(::getpid()));
    fs::remove_all(dir);
    c.out_dir = dir.string();
    truth = rs::simulate_rsat(c);
    radarsat::ExtractRequest rq;
    rq.data_file = truth.data_path;
    rq.leader_file = truth.leader_path;
    rq.raw_path = (dir / "RAW").string();
    rq.chirp_path = (dir / "CHIRP").string();
    acq = radarsat::radar_extract(rq);
    sarfocuser::SARFocuser_conf conf;
    conf.readconf(std::string(SAR_DATA_DIR) + "/parameters_RS.hdr");
    conf.DCref = dcref;
    if (unweighted) {
      conf.az.RangeWindowHammingParameter = 0.0;
      conf.az.AzimuthWindowHammingParameter = 0.0;
    }
    focuser = std::make_unique<sarfocuser::SARFocuser>(conf, sarfocuser::SARFocuser_input{rq.raw_path, rq.chirp_path, ""},
                                                       sarfocuser::SARFocuser_output{(dir / "scene_slc").string()});
    status = focuser->run();
    if (status != 0) return;
    const auto& p = focuser->proc();
    slc.resize(static_cast<std::size_t>(p.focusedLines) * p.focusedSamples);
    std::ifstream in(dir / "scene_slc", std::ios::binary);
    in.read(reinterpret_cast<char*>(slc.data()), static_cast<std::streamsize>(slc.size() * 8));
    if (!in) status = -2;
  }
  ~Focused() { fs::remove_all(dir); }

  /// Expected SLC position of target i from its zero-Doppler time and range.
  std::pair<double, double> expected(std::size_t i) const {
    const auto& p = focuser->proc();
    const auto& t = truth.targets[i];
    return {(t.zero_doppler_time - p.firstLineTime) * truth.prf, (t.range_time - p.firstSampleTime) * truth.sampling_frequency};
  }

  analyser::IrfMeasure measure(std::size_t i) const {
    const auto& p = focuser->proc();
    analyser::ComplexImageView view{slc, p.focusedLines, p.focusedSamples, p.focusedSamples, 0, 0};
    const auto [line, sample] = expected(i);
    return analyser::measure_point(view, line, sample, analyser::AnalyserOptions{});
  }
};

rs::RsatConfig scene(const std::string& beam) {
  rs::RsatConfig c;
  c.beam = beam;
  c.lines = 2560;
  c.samples = beam == "F1" ? 3072 : 2048;
  c.noise_db = 0.0;
  c.targets = {{{45.0, 10.0, 0.0}, 3.0}};
  return c;
}

}  // namespace

TEST(Focuser, PointTargetsOfBothBeamsUnweighted) {
  struct Case {
    const char* beam;
    double rangeWidth;  // 0.886 fs / B
  };
  for (const Case& c : {Case{"F1", 0.954}, Case{"S3", 0.946}}) {
    SCOPED_TRACE(c.beam);
    Focused f(std::string(c.beam) + "_plain", scene(c.beam), true);
    ASSERT_EQ(f.status, 0) << f.focuser->failed_stage();
    const auto m = f.measure(0);
    ASSERT_TRUE(m.valid) << m.problem;
    const auto [line, sample] = f.expected(0);
    std::printf("%s: centroid %.1f Hz (truth %.1f), peak %.3f %.3f expected %.3f %.3f, widths rg %.3f az %.3f, "
                "PSLR rg %.2f az %.2f dB, ISLR rg %.2f az %.2f dB\n",
                c.beam, f.focuser->centroid(), f.truth.targets[0].doppler_centroid, m.peak_line, m.peak_sample, line, sample,
                m.res_rg_px, m.res_az_px, m.pslr_rg_db, m.pslr_az_db, m.islr_rg_db, m.islr_az_db);
    EXPECT_NEAR(m.peak_line, line, 0.1);
    EXPECT_NEAR(m.peak_sample, sample, 0.1);
    EXPECT_NEAR(m.res_rg_px, c.rangeWidth, 0.05 * c.rangeWidth);
    EXPECT_NEAR(m.pslr_rg_db, -13.3, 1.0);
    // Unweighted azimuth: one PRF of a 15 m antenna's band, the pattern tapering its edges.
    EXPECT_NEAR(m.res_az_px, 1.12, 0.05);
    EXPECT_LT(m.pslr_az_db, -18.0);

    // The measured peak geolocated through the leader's orbit lands on the target.
    const auto& p = f.focuser->proc();
    geometry::grpt_rec rec;
    for (std::size_t k = 0; k < 5; ++k)
      rec.state_vectors[k] = {p.orbitPositions[3 * k], p.orbitPositions[3 * k + 1], p.orbitPositions[3 * k + 2]};
    rec.t0 = p.orbitStartTime;
    rec.dt = p.orbitSpacing;
    rec.azimuth_time = p.firstLineTime + m.peak_line / f.truth.prf;
    rec.tau = p.firstSampleTime + m.peak_sample / f.truth.sampling_frequency;
    rec.wavelength = 0.05656;
    ASSERT_EQ(geometry::gr_pt_lat_lon(rec), 0);
    const auto& truth = f.truth.targets[0].ecef;
    const geometry::Vec3 error{rec.x - truth.x, rec.y - truth.y, rec.z - truth.z};
    const auto v = geometry::orbit_state_at(f.acq.orbit, rec.azimuth_time).velocity;
    const double along = geometry::dot(error, geometry::unit(v));
    const double across = std::sqrt(std::max(0.0, geometry::dot(error, error) - along * along));
    const double azimuthPixel = rec.ground_velocity / f.truth.prf;
    const double groundRangePixel = 0.5 * 299792458.0 / f.truth.sampling_frequency / std::sin(rec.incidence * M_PI / 180.0);
    std::printf("%s: geolocation error %.2f m along track (pixel %.2f m), %.2f m across (pixel %.2f m)\n", c.beam, along,
                azimuthPixel, across, groundRangePixel);
    EXPECT_LT(std::abs(along), azimuthPixel);
    EXPECT_LT(across, groundRangePixel);
  }
}

TEST(Focuser, TargetAcrossGapSwstChangeAndAttenuationStepFocusesLikeOneThatIsNot) {
  rs::RsatConfig c = scene("S3");
  c.lines = 4096;
  // The first target's echoes span lines 1600-2500; the second's, imaged earlier, 770-1670.
  c.targets = {{{45.0, 10.0, 0.0}, 3.0}, {{45.04, 10.0, 0.0}, 3.0}};
  c.gap_line = 2100;
  c.gap_length = 5;
  c.swst_change_line = 1950;
  c.swst_change_counts = 12;
  c.attenuation_step_line = 2200;
  c.attenuation_step_db = 5;
  Focused f("S3_faults", c, true);
  ASSERT_EQ(f.status, 0) << f.focuser->failed_stage();
  EXPECT_EQ(f.acq.missing_lines, 5);
  const auto across = f.measure(0), clean = f.measure(1);
  ASSERT_TRUE(across.valid) << across.problem;
  ASSERT_TRUE(clean.valid) << clean.problem;
  std::printf("across the faults: widths rg %.3f az %.3f, PSLR rg %.2f az %.2f; clean: rg %.3f az %.3f, PSLR rg %.2f az %.2f\n",
              across.res_rg_px, across.res_az_px, across.pslr_rg_db, across.pslr_az_db, clean.res_rg_px, clean.res_az_px,
              clean.pslr_rg_db, clean.pslr_az_db);
  for (std::size_t i = 0; i < 2; ++i) {
    const auto m = i == 0 ? across : clean;
    const auto [line, sample] = f.expected(i);
    EXPECT_NEAR(m.peak_line, line, 0.1) << i;
    EXPECT_NEAR(m.peak_sample, sample, 0.1) << i;
  }
  EXPECT_NEAR(across.res_rg_px, clean.res_rg_px, 0.02 * clean.res_rg_px);
  EXPECT_NEAR(across.res_az_px, clean.res_az_px, 0.02 * clean.res_az_px);
}

TEST(Focuser, CentroidOfSixPrfsEstimatedFromClutterPutsTheTargetAtZeroDoppler) {
  rs::RsatConfig c = scene("S3");
  // Target and clutter low enough that the 4-bit levels do not clip their sum.
  c.targets = {{{45.0, 10.0, 0.0}, 2.0}};
  c.clutter.power_db = 3.0;
  Focused f("S3_clutter", c, true);
  ASSERT_EQ(f.status, 0) << f.focuser->failed_stage();
  EXPECT_TRUE(f.focuser->centroid_from_data());
  const double prf = f.truth.prf;
  EXPECT_EQ(std::lround(f.truth.clutter_centroid_mid / prf), 6);
  EXPECT_NEAR(f.focuser->centroid(), f.truth.clutter_centroid_mid, 0.02 * prf);
  const auto m = f.measure(0);
  ASSERT_TRUE(m.valid) << m.problem;
  const auto [line, sample] = f.expected(0);
  std::printf("clutter scene: centroid %.1f Hz from the data (clutter truth %.1f), peak %.3f %.3f expected %.3f %.3f\n",
              f.focuser->centroid(), f.truth.clutter_centroid_mid, m.peak_line, m.peak_sample, line, sample);
  // The estimated centroid changes by about 1.8e6 Hz/s of range time here: the kernel's
  // equivalent velocity must see the squint at either end of each range block, or the target
  // moves by an eighth of a line.
  EXPECT_NEAR(m.peak_line, line, 0.1);
  EXPECT_NEAR(m.peak_sample, sample, 0.1);
}

TEST(Focuser, RawDataSetWithoutItsDescriptionIsRefusedBeforeAnyStage) {
  const fs::path dir = fs::temp_directory_path() / ("rsat_focus_nodesc_" + std::to_string(::getpid()));
  fs::remove_all(dir);
  fs::create_directories(dir);
  const std::string raw = (dir / "RAW").string(), chirp = (dir / "CHIRP").string();
  std::ofstream(raw) << "lines";
  std::ofstream(chirp) << "replica";
  sarfocuser::SARFocuser_conf conf;
  conf.readconf(std::string(SAR_DATA_DIR) + "/parameters_RS.hdr");
  for (const bool partial : {false, true}) {
    SCOPED_TRACE(partial ? "a record missing" : "no description");
    if (partial) {
      // Everything a raw set has but its pulse.
      io::GeneralSAR gs;
      gs.dataFile.lines = 1;
      gs.dataFile.pixels = 5;
      gs.roi.SetFastAxe(0.0067, 1e-7, 5);
      gs.sampling.prf_hz = 1257.0;
      gs.stateVectors.SVCreate(0.0, 30.0, 5);
      gs.info.SceneID = "x";
      for (io::GSObject s : {io::kGSDataFile, io::kGSRoi, io::kGSSamplingConstants, io::kGSStateVectors,
                             io::kGSDataSetInfo, io::kGSSensorAttitude, io::kGSSwathInfo})
        gs.GSenable(s);
      ASSERT_EQ(gs.GSwrite(raw + ".hdr"), 0);
    }
    sarfocuser::SARFocuser f(conf, {raw, chirp, ""}, {(dir / "scene_slc").string()});
    EXPECT_EQ(f.run(), 10);
    EXPECT_EQ(f.failed_stage(), "GeneralRAWData::readhdr");
    EXPECT_FALSE(fs::exists(dir / "scene_slc"));
    EXPECT_FALSE(fs::exists(dir / "scene_slc.rgfoc"));
  }
  fs::remove_all(dir);
}

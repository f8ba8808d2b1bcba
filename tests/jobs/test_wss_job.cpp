// The level 1 WSS job through sarfocus: a simulated ASA_WSS_1P product becomes one multilooked
// image with its description and quick-look; wrong or damaged inputs stop it with their code and
// leave nothing in the output folder.
#include <gtest/gtest.h>

#include <cmath>
#include <cstring>
#include <sstream>

#include "base/convert.hpp"
#include "geometry/geolocation.hpp"
#include "jobs/multilook_step.hpp"
#include "simulator/wss_product.hpp"
#include "annotation_keys.hpp"
#include "test_standalone_support.hpp"

using namespace sar::test;
using namespace sar::jobs;

namespace {

const std::string kRealOrbit =
    std::string(SAR_REAL_DATA_DIR) + "/DOR_VOR_AX/DOR_VOR_AXVF-P20080331_075200_20080301_215527_20080303_002327";

std::string simulate_wss(const fs::path& dir, int dropSwath = 0, bool truncated = false) {
  sar::simulator::WssConfig c;
  c.out_dir = dir.string();
  c.orbit_path = kRealOrbit;
  c.samples = 400;
  c.overlap = 40;
  c.bursts = 4;
  c.drop_swath = dropSwath;
  c.truncate_mds = truncated;
  c.targets = {{3, 420.0, 200.0, 4000.0}};
  return sar::simulator::write_wss_product(c).path;
}

}  // namespace

TEST(WssJob, SlantAndGroundRangeImagesFromASimulatedProduct) {
  ScratchJob job("wss_job");
  const std::string product = simulate_wss(job.dir() / "in");
  const std::string stem = product_stem(product);
  for (bool ground : {false, true}) {
    const std::string out = (job.dir() / (ground ? "out_gr" : "out_pwr")).string();
    std::vector<std::string> args = {"wss", product, "--orbit", kRealOrbit, "--out", out};
    if (ground) args.push_back("--ground-range");
    const CliResult r = sarfocus(args);
    ASSERT_EQ(r.status, 0) << r.err << r.out;
    const fs::path image = fs::path(out) / looked_product_name(stem, ground);
    for (const char* suffix : {"", ".hdr", ".vrt", "_hdr", ".sml", ".tif"})
      EXPECT_TRUE(fs::exists(image.string() + suffix)) << suffix;
    const int lines = key_int(image.string() + "_hdr", "NrOfLinesPerImage");
    const int samples = key_int(image.string() + "_hdr", "NrOfPixelsPerLine");
    ASSERT_GT(lines, 0);
    EXPECT_EQ(fs::file_size(image), static_cast<std::uintmax_t>(lines) * samples * 4);
    EXPECT_GT(key_int(image.string() + "_hdr", "NRangeLooks"), 1);
    if (ground) {
      EXPECT_EQ(key_int(image.string() + "_hdr", "PixelSpacingRg"), 75);
    }
    StandaloneRequest req;
    req.mode = "wss";
    req.product = product;
    req.outDir = out;
    req.groundRange = ground;
    EXPECT_TRUE(outputs_complete(req));
    const CliResult info = shell("command -v gdalinfo >/dev/null && gdalinfo " + image.string() + ".vrt 2>&1");
    if (!info.out.empty()) {
      EXPECT_NE(info.out.find("Size is " + std::to_string(samples) + ", " + std::to_string(lines)), std::string::npos)
          << info.out;
    }
  }
}

TEST(WssJob, WrongAndDamagedInputsStopWithTheirCode) {
  ScratchJob job("wss_bad");
  const std::string good = simulate_wss(job.dir() / "good");
  const std::string ims = std::string(SAR_REAL_DATA_DIR) +
                          "/ASA_IMS_1P_truncated/ASA_IMS_1PNESA20040703_205338_000000182028_00172_12250_00001672562030318361237.N1";
  const std::string ins = std::string(SAR_REAL_DATA_DIR) +
                          "/ASA_INS_AX/ASA_INS_AXVIEC20070227_105626_20070228_060000_20071231_000000";
  struct Case {
    const char* name;
    std::string product;
    std::string orbit;  // empty: none given (NotOK)
    int status;
    const char* words;
  } cases[] = {
      {"an IMS product", ims, kRealOrbit, 7, "456962"},
      {"no orbit", good, "", 7, "DOR_VOR"},
      {"an orbit of another type", good, ins, 7, "DOR_VOR"},
      {"an MDS shorter than its DSD", simulate_wss(job.dir() / "cut", 0, true), kRealOrbit, 2, "shorter than its DSD"},
      {"a missing sub-swath", simulate_wss(job.dir() / "drop", 3), kRealOrbit, 2, "sub-swath 3"},
  };
  for (const auto& c : cases) {
    const std::string out = (job.dir() / "out").string();
    std::vector<std::string> args = {"wss", c.product, "--out", out};
    if (!c.orbit.empty()) {
      args.push_back("--orbit");
      args.push_back(c.orbit);
    }
    const CliResult r = sarfocus(args);
    EXPECT_EQ(r.status, c.status) << c.name << ": " << r.err;
    EXPECT_NE(r.err.find(c.words), std::string::npos) << c.name << ": " << r.err;
    for (const auto& e : fs::directory_iterator(out))
      EXPECT_EQ(e.path().filename().string(), ".sarfocus") << c.name << " left " << e.path();
    fs::remove_all(out);
  }
}


// The ground range image located through its annotation alone: columns 75 m apart on the
// ellipsoid in all five sub-swaths, and each target where the simulator put it.
TEST(WssJob, GroundRangeImageIsWhereItsAnnotationSays) {
  ScratchJob job("wss_geo");
  sar::simulator::WssConfig c;
  c.out_dir = (job.dir() / "in").string();
  c.orbit_path = kRealOrbit;
  c.samples = 400;
  c.overlap = 40;
  c.bursts = 4;
  c.clutter_std = 30.0;
  c.targets = {{1, 430.0, 150.0, 20000.0}, {3, 470.0, 200.0, 20000.0}, {5, 520.0, 300.0, 20000.0}};
  const auto product = sar::simulator::write_wss_product(c);
  const std::string out = (job.dir() / "out").string();
  const CliResult r = sarfocus({"wss", product.path, "--orbit", kRealOrbit, "--out", out, "--ground-range", "--no-quicklook"});
  ASSERT_EQ(r.status, 0) << r.err;
  const fs::path image = fs::path(out) / (product_stem(product.path) + "_gr");
  const fs::path a = image.string() + "_hdr";
  const int lines = key_int(a, "NrOfLinesPerImage"), samples = key_int(a, "NrOfPixelsPerLine");
  const auto coeff = doubles_of(a, "GroundRangeSlantTimeCoeff");
  const auto pos = doubles_of(a, "pos");
  const auto step = doubles_of(a, "AzimuthTimeStep");
  const auto delta = doubles_of(a, "TimeDelta");
  ASSERT_EQ(coeff.size(), 5u);
  ASSERT_EQ(pos.size(), 15u);
  ASSERT_EQ(step.size(), 1u);
  ASSERT_EQ(delta.size(), 1u);
  const double first = sar::base::ascii2sec85(text_of(a, "AzimuthStartTime"));
  const double orbitFirst = sar::base::ascii2sec85(text_of(a, "TimeFirst"));

  auto locate = [&](double line, double column) {
    sar::geometry::grpt_rec rec;
    for (std::size_t k = 0; k < 5; ++k) rec.state_vectors[k] = {pos[3 * k], pos[3 * k + 1], pos[3 * k + 2]};
    rec.t0 = orbitFirst;
    rec.dt = delta[0];
    rec.azimuth_time = first + line * step[0];
    rec.tau = 0.0;
    for (int k = 4; k >= 0; --k) rec.tau = rec.tau * column + coeff[static_cast<std::size_t>(k)];
    rec.wavelength = 299792458.0 / 5.331e9;
    EXPECT_EQ(sar::geometry::gr_pt_lat_lon(rec), 0);
    return sar::geometry::Vec3{rec.x, rec.y, rec.z};
  };
  auto distance = [](const sar::geometry::Vec3& p, const sar::geometry::Vec3& q) {
    return std::hypot(p[0] - q[0], p[1] - q[1], p[2] - q[2]);
  };
  for (int j = 0; j + 1 < samples; j += std::max(1, (samples - 2) / 12)) {
    const double d = distance(locate(0.5 * lines, j), locate(0.5 * lines, j + 1));
    EXPECT_NEAR(d, 75.0, 0.375) << "column " << j;
  }

  const auto amplitude = [&] {
    const std::string bytes = slurp(image);
    std::vector<float> v(bytes.size() / 4);
    std::memcpy(v.data(), bytes.data(), v.size() * 4);
    return v;
  }();
  ASSERT_EQ(amplitude.size(), static_cast<std::size_t>(lines) * samples);
  const double fs = c.sampling_rate, dt = c.line_time_interval;
  for (const auto& t : c.targets) {
    // The truth: where the simulator's line and sample of the target lie on the ground.
    sar::geometry::grpt_rec rec;
    for (std::size_t k = 0; k < 5; ++k) rec.state_vectors[k] = {pos[3 * k], pos[3 * k + 1], pos[3 * k + 2]};
    rec.t0 = orbitFirst;
    rec.dt = delta[0];
    rec.azimuth_time = product.first_line_time + t.line * dt;
    rec.tau = product.near_time[static_cast<std::size_t>(t.swath - 1)] + t.sample / fs;
    rec.wavelength = 299792458.0 / 5.331e9;
    ASSERT_EQ(sar::geometry::gr_pt_lat_lon(rec), 0);
    const sar::geometry::Vec3 truth{rec.x, rec.y, rec.z};
    // The brightest cell of the image within 300 m of it.
    int bestLine = -1, bestColumn = -1;
    float best = 0.0f;
    const int line0 = static_cast<int>(std::lround((rec.azimuth_time - first) / step[0]));
    for (int l = std::max(0, line0 - 20); l < std::min(lines, line0 + 21); ++l)
      for (int col = 0; col < samples; ++col)
        if (amplitude[static_cast<std::size_t>(l) * samples + col] > best &&
            distance(locate(l, col), truth) < 300.0) {
          best = amplitude[static_cast<std::size_t>(l) * samples + col];
          bestLine = l;
          bestColumn = col;
        }
    ASSERT_GE(bestLine, 0) << "target in SS" << t.swath;
    EXPECT_GT(best, 50.0f * 30.0f) << "target in SS" << t.swath;
    EXPECT_LT(distance(locate(bestLine, bestColumn), truth), 75.0) << "target in SS" << t.swath;
  }
}

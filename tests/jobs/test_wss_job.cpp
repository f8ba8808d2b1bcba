// The level 1 WSS job through sarfocus: a simulated ASA_WSS_1P product becomes one multilooked
// image with its description and quick-look; wrong or damaged inputs stop it with their code and
// leave nothing in the output folder.
#include <gtest/gtest.h>

#include "jobs/multilook_step.hpp"
#include "simulator/wss_product.hpp"
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

int key_int(const fs::path& annotation, const std::string& key) {
  for (const auto& l : lines_of(annotation))
    if (l.rfind(key + " = ", 0) == 0) return std::atoi(l.c_str() + key.size() + 3);
  return -1;
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

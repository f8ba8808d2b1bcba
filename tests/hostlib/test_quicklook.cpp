// Quick-look rendering: size, grey levels, no-data, failure paths, and geographic tie points
// as GDAL's library and (when installed) its gdalinfo read them.
#include <gdal.h>
#include <gtest/gtest.h>
#include <ogr_srs_api.h>
#include <unistd.h>

#include <array>
#include <cmath>
#include <cstdio>
#include <filesystem>
#include <iterator>
#include <limits>
#include <string>
#include <vector>

#include "hostlib/quicklook.hpp"

namespace fs = std::filesystem;
using namespace sar::hostlib;

namespace {

struct Image {
  int width = 0, height = 0;
  std::vector<uint8_t> pixels;
  std::vector<GDAL_GCP> gcps;  // pixel, line and lon/lat only: the texts are not kept
  std::string compression, gcpSrs;
  int hasNoData = 0;
  double noData = -1.0;
  uint8_t at(int x, int y) const { return pixels[static_cast<std::size_t>(y) * width + x]; }
};

Image read_tiff(const std::string& path) {
  GDALAllRegister();
  Image img;
  GDALDatasetH ds = GDALOpen(path.c_str(), GA_ReadOnly);
  if (!ds) return img;
  img.width = GDALGetRasterXSize(ds);
  img.height = GDALGetRasterYSize(ds);
  img.pixels.resize(static_cast<std::size_t>(img.width) * img.height);
  GDALRasterBandH band = GDALGetRasterBand(ds, 1);
  if (GDALGetRasterCount(ds) != 1 || GDALGetRasterDataType(band) != GDT_Byte ||
      GDALRasterIO(band, GF_Read, 0, 0, img.width, img.height, img.pixels.data(), img.width, img.height, GDT_Byte, 0,
                   0) != CE_None)
    img.pixels.clear();
  img.noData = GDALGetRasterNoDataValue(band, &img.hasNoData);
  if (const char* c = GDALGetMetadataItem(ds, "COMPRESSION", "IMAGE_STRUCTURE")) img.compression = c;
  const GDAL_GCP* g = GDALGetGCPs(ds);
  for (int i = 0; i < GDALGetGCPCount(ds); ++i)
    img.gcps.push_back({nullptr, nullptr, g[i].dfGCPPixel, g[i].dfGCPLine, g[i].dfGCPX, g[i].dfGCPY, g[i].dfGCPZ});
  if (OGRSpatialReferenceH srs = GDALGetGCPSpatialRef(ds)) {
    if (const char* name = OSRGetName(srs)) img.gcpSrs = name;
  }
  GDALClose(ds);
  return img;
}

// Background of amplitude 1, a bright 30 x 20 block of amplitude 20 at lines 100..119,
// samples 60..89, and the last 10 lines without data.
bool scene(int line, std::span<std::complex<float>> row) {
  for (std::size_t s = 0; s < row.size(); ++s) {
    float a = 1.0f;
    if (line >= 100 && line < 120 && s >= 60 && s < 90) a = 20.0f;
    if (line >= 190) a = std::numeric_limits<float>::quiet_NaN();
    // Phase must not matter.
    row[s] = std::polar(a, 0.7f * static_cast<float>(s));
  }
  return true;
}

class QuickLook : public ::testing::Test {
 protected:
  void SetUp() override {
    dir_ = fs::temp_directory_path() / ("ql_" + std::to_string(::getpid()));
    fs::create_directories(dir_);
  }
  void TearDown() override { fs::remove_all(dir_); }
  fs::path dir_;
};

}  // namespace

TEST_F(QuickLook, SizeKeepsTheGroundAspect) {
  QuickLookRequest r;
  r.maxWidth = 100;
  r.maxHeight = 100;
  struct Case {
    int lines, samples;
    double rg, az;
    int w, h;
  };
  for (Case c : {Case{200, 300, 1, 1, 100, 67}, Case{3000, 1000, 20, 4, 100, 60}, Case{10, 10, 1, 1, 10, 10},
                 Case{5000, 40, 1, 1, 1, 100}}) {
    r.rangeSpacing = c.rg;
    r.azimuthSpacing = c.az;
    const auto size = quicklook_size(c.lines, c.samples, r);
    EXPECT_EQ(size[0], c.w) << c.lines << "x" << c.samples;
    EXPECT_EQ(size[1], c.h) << c.lines << "x" << c.samples;
  }
}

TEST_F(QuickLook, GreyLevelsFollowTheMedianAndBrightTargetsSaturate) {
  QuickLookRequest r;
  r.maxWidth = 150;  // two input samples and lines per output pixel
  r.maxHeight = 100;
  r.corners = {GeoCorner{45.0, 10.0}, GeoCorner{45.1, 10.9}, GeoCorner{44.2, 9.8}, GeoCorner{44.3, 10.7}};
  const std::string out = (dir_ / "scene_slc.tif").string();
  QuickLookResult res;
  ASSERT_EQ(write_quicklook_geotiff(out, 200, 300, scene, r, &res), 0);
  EXPECT_FALSE(fs::exists(out + ".part"));
  EXPECT_NEAR(res.medianAmplitude, 1.0, 1e-6);

  const Image img = read_tiff(out);
  ASSERT_EQ(img.width, 150);
  ASSERT_EQ(img.height, 100);
  EXPECT_EQ(img.at(5, 5), 64);      // median amplitude -> 254 / 4
  EXPECT_EQ(img.at(37, 55), 254);   // inside the bright block (samples 74-75, lines 110-111)
  EXPECT_EQ(img.at(29, 55), 64);    // just left of it
  EXPECT_EQ(img.at(10, 97), 0);     // no data

  EXPECT_EQ(img.compression, "DEFLATE");
  EXPECT_EQ(img.hasNoData, 1);
  EXPECT_EQ(img.noData, 0.0);
  EXPECT_EQ(img.gcpSrs, "WGS 84");
  // The four outer pixel corners in the order near-early, far-early, near-late, far-late.
  ASSERT_EQ(img.gcps.size(), 4u);
  const double expected[4][4] = {{0, 0, 10.0, 45.0}, {150, 0, 10.9, 45.1}, {0, 100, 9.8, 44.2}, {150, 100, 10.7, 44.3}};
  for (std::size_t k = 0; k < 4; ++k) {
    EXPECT_DOUBLE_EQ(img.gcps[k].dfGCPPixel, expected[k][0]) << k;
    EXPECT_DOUBLE_EQ(img.gcps[k].dfGCPLine, expected[k][1]) << k;
    EXPECT_DOUBLE_EQ(img.gcps[k].dfGCPX, expected[k][2]) << k;
    EXPECT_DOUBLE_EQ(img.gcps[k].dfGCPY, expected[k][3]) << k;
  }
  // Nothing beside the image: every tag went into the TIFF itself.
  EXPECT_EQ(std::distance(fs::directory_iterator(dir_), fs::directory_iterator()), 1);

  // Without georeferencing, no tie points and no coordinate system.
  r.georeferenced = false;
  ASSERT_EQ(write_quicklook_geotiff(out, 200, 300, scene, r), 0);
  EXPECT_TRUE(read_tiff(out).gcps.empty());
  r.georeferenced = true;

  // Twice the scale doubles the background grey.
  r.scale = 2.0;
  ASSERT_EQ(write_quicklook_geotiff(out, 200, 300, scene, r), 0);
  EXPECT_EQ(read_tiff(out).at(5, 5), 127);
}

// Sums taken from an image in memory, in uneven runs of lines, give the pixels of the
// quick-look read line by line from its source.
TEST_F(QuickLook, SumsOfRunsInMemoryEqualTheReadBackImage) {
  QuickLookRequest r;
  r.maxWidth = 70;  // uneven blocks: 300 samples and 200 lines onto 70 x 47 pixels
  r.maxHeight = 47;
  std::vector<std::complex<float>> image(200 * 300);
  for (int l = 0; l < 200; ++l) scene(l, std::span<std::complex<float>>(image.data() + l * 300, 300));
  const std::string fromSource = (dir_ / "source.tif").string(), fromSums = (dir_ / "sums.tif").string();
  ASSERT_EQ(write_quicklook_geotiff(fromSource, 200, 300, scene, r), 0);
  QuickLookGrid grid;
  ASSERT_EQ(grid.start(200, 300, r), 0);
  for (const auto [first, count] : {std::array<int, 2>{0, 1}, {1, 63}, {64, 7}, {71, 129}})
    quicklook_add(grid, first, count, image.data() + first * 300, 300);
  ASSERT_EQ(write_quicklook_grid(fromSums, grid, r), 0);
  const Image a = read_tiff(fromSource), b = read_tiff(fromSums);
  ASSERT_EQ(a.width, 70);
  ASSERT_FALSE(a.pixels.empty());
  EXPECT_EQ(a.pixels, b.pixels);
  // Lines left out leave their pixels without data.
  QuickLookGrid part;
  ASSERT_EQ(part.start(200, 300, r), 0);
  quicklook_add(part, 0, 100, image.data(), 300);
  ASSERT_EQ(write_quicklook_grid(fromSums, part, r), 0);
  EXPECT_EQ(read_tiff(fromSums).at(5, 40), 0);
  EXPECT_NE(read_tiff(fromSums).at(5, 5), 0);
  EXPECT_EQ(write_quicklook_grid(fromSums, QuickLookGrid(), r), 10);
}

TEST_F(QuickLook, GdalSeesWgs84TiePoints) {
  if (std::system("gdalinfo --version >/dev/null 2>&1") != 0) GTEST_SKIP() << "gdalinfo not installed";
  QuickLookRequest r;
  r.maxWidth = 64;
  r.maxHeight = 64;
  r.corners = {GeoCorner{45.0, 10.0}, GeoCorner{45.1, 10.9}, GeoCorner{44.2, 9.8}, GeoCorner{44.3, 10.7}};
  const std::string out = (dir_ / "g.tif").string();
  ASSERT_EQ(write_quicklook_geotiff(out, 200, 300, scene, r), 0);
  const std::string info = (dir_ / "info.txt").string();
  ASSERT_EQ(std::system(("gdalinfo '" + out + "' > '" + info + "' 2>&1").c_str()), 0);
  std::FILE* f = std::fopen(info.c_str(), "r");
  ASSERT_NE(f, nullptr);
  std::string text;
  char buf[4096];
  for (std::size_t n; (n = std::fread(buf, 1, sizeof buf, f)) > 0;) text.append(buf, n);
  std::fclose(f);
  EXPECT_NE(text.find("GCP[  3]"), std::string::npos) << text;
  EXPECT_NE(text.find("WGS 84"), std::string::npos) << text;
  EXPECT_NE(text.find("(10.7,44.3,0)"), std::string::npos) << text;
  EXPECT_NE(text.find("NoData Value=0"), std::string::npos) << text;
}

TEST_F(QuickLook, FailuresLeaveNothingBehind) {
  QuickLookRequest r;
  const std::string out = (dir_ / "fail.tif").string();
  auto broken = [](int line, std::span<std::complex<float>>) { return line < 50; };
  EXPECT_EQ(write_quicklook_geotiff(out, 200, 300, broken, r), 10);
  EXPECT_EQ(write_quicklook_geotiff(out, 0, 300, scene, r), 10);
  EXPECT_EQ(write_quicklook_geotiff((dir_ / "no" / "dir.tif").string(), 200, 300, scene, r), 10);
  EXPECT_FALSE(fs::exists(out));
  EXPECT_FALSE(fs::exists(out + ".part"));
}

// Quick-look rendering: size, grey levels, no-data, failure paths, and geographic tie points
// as libtiff and (when installed) GDAL read them.
#include <geotiff/xtiffio.h>
#include <gtest/gtest.h>
#include <unistd.h>

#include <cmath>
#include <cstdio>
#include <filesystem>
#include <limits>
#include <vector>

#include "hostlib/quicklook.hpp"

namespace fs = std::filesystem;
using namespace sar::hostlib;

namespace {

struct Image {
  int width = 0, height = 0;
  std::vector<uint8_t> pixels;
  std::vector<double> ties;
  uint8_t at(int x, int y) const { return pixels[static_cast<std::size_t>(y) * width + x]; }
};

Image read_tiff(const std::string& path) {
  Image img;
  TIFF* t = XTIFFOpen(path.c_str(), "r");
  if (!t) return img;
  uint32_t w = 0, h = 0;
  TIFFGetField(t, TIFFTAG_IMAGEWIDTH, &w);
  TIFFGetField(t, TIFFTAG_IMAGELENGTH, &h);
  img.width = static_cast<int>(w);
  img.height = static_cast<int>(h);
  img.pixels.resize(static_cast<std::size_t>(w) * h);
  for (uint32_t y = 0; y < h; ++y) TIFFReadScanline(t, img.pixels.data() + y * w, y, 0);
  uint16_t n = 0;
  double* ties = nullptr;
  if (TIFFGetField(t, TIFFTAG_GEOTIEPOINTS, &n, &ties)) img.ties.assign(ties, ties + n);
  XTIFFClose(t);
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

  ASSERT_EQ(img.ties.size(), 24u);
  EXPECT_DOUBLE_EQ(img.ties[3], 10.0);   // near-early longitude at pixel (0, 0)
  EXPECT_DOUBLE_EQ(img.ties[4], 45.0);
  EXPECT_DOUBLE_EQ(img.ties[18], 150.0);  // far-late at the outer corner (w, h)
  EXPECT_DOUBLE_EQ(img.ties[19], 100.0);
  EXPECT_DOUBLE_EQ(img.ties[21], 10.7);
  EXPECT_DOUBLE_EQ(img.ties[22], 44.3);

  // Twice the scale doubles the background grey.
  r.scale = 2.0;
  ASSERT_EQ(write_quicklook_geotiff(out, 200, 300, scene, r), 0);
  EXPECT_EQ(read_tiff(out).at(5, 5), 127);
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

#include <gtest/gtest.h>
#include <unistd.h>

#include <algorithm>
#include <cmath>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <numeric>

#include "base/profile.hpp"
#include "multilook/strip_detect.hpp"
#include "multilook/strip_multilook.hpp"
#include "strip_fixture.hpp"

namespace sar::multilook {
namespace {

namespace fs = std::filesystem;
using namespace testing;

struct Looked {
  int status = -1;
  StripMultilookResult result;
  std::vector<float> amplitude;
  int lines = 0;
  int samples = 0;
};

Looked multilook(const SlcOnDisk& d, int fa, int fr, bool ground = false) {
  Looked out;
  StripMultilookRequest req;
  req.slc = d.slc;
  req.output = d.dir + "/scene_pwr";
  req.azimuthLooks = fa;
  req.rangeLooks = fr;
  req.groundRange = ground;
  out.status = run_strip_multilook(req, out.result);
  if (out.status == 0) out.amplitude = read_float_raster(req.output, out.lines, out.samples);
  return out;
}

double mean_power(const std::vector<float>& a) {
  double s = 0.0;
  for (float v : a) s += static_cast<double>(v) * v;
  return s / static_cast<double>(a.size());
}

TEST(StripLooks, SizesAndCellsOfPartialLooks) {
  struct Case {
    int n, f, size, lastCells;
  } cases[] = {{10, 1, 10, 2}, {10, 2, 5, 4}, {10, 3, 4, 2}, {10, 4, 3, 4}, {7, 8, 1, 14}, {64, 8, 8, 16}};
  for (const auto& c : cases) {
    EXPECT_EQ(looked_size(c.n, c.f), c.size) << c.n << "/" << c.f;
    RangeLookDetector det(c.n, c.f);
    ASSERT_EQ(det.output_samples(), c.size);
    EXPECT_EQ(det.cells().back(), c.lastCells) << c.n << "/" << c.f;
    EXPECT_EQ(std::accumulate(det.cells().begin(), det.cells().end(), 0), 2 * c.n);
  }
}

TEST(StripLooks, OversampledLineKeepsTheSamplesBetweenItsCells) {
  // Oversampled cell j sits at j/2 - 1/4, and a band-limited tone is reproduced at every cell.
  const int n = 90;
  const double f = 15.0 / n;  // cycles a sample, periodic over the line
  std::vector<fcomplex> line(n);
  for (int s = 0; s < n; ++s) line[s] = std::polar(1.0f, static_cast<float>(2 * M_PI * f * s));
  RangeLookDetector det(n, 1);
  std::vector<double> sum(det.output_samples());
  det.add_line(line, sum);
  const auto wide = det.oversampled();
  for (int j = 0; j < 2 * n; ++j) {
    const double t = j / 2.0 - 0.25;
    const std::complex<double> expected = std::polar(1.0, 2 * M_PI * f * t);
    EXPECT_NEAR(std::abs(std::complex<double>(wide[j]) - expected), 0.0, 2e-4) << j;
  }
}

TEST(StripLooks, PresumIsTheComplexMeanOfEachCell) {
  const int rows = 2, samples = 7, looks = 3;
  std::vector<fcomplex> block(rows * samples);
  for (int i = 0; i < rows * samples; ++i) block[i] = {static_cast<float>(i), static_cast<float>(-2 * i)};
  std::vector<fcomplex> out(samples / looks);
  presum_block(block, rows, samples, looks, out);
  // Cell 1: samples 3, 4, 5 of both rows: (3+4+5+10+11+12)/6 = 7.5.
  EXPECT_FLOAT_EQ(out[0].real(), (0 + 1 + 2 + 7 + 8 + 9) / 6.0f);
  EXPECT_FLOAT_EQ(out[1].real(), 7.5f);
  EXPECT_FLOAT_EQ(out[1].imag(), -15.0f);
}

// White clutter: the mean power survives every pair of look factors from 1 to 8, and the looks
// smooth the speckle as much as Fa x Fr independent cells would (more with the range
// oversampling, whose half-sample cells are partly independent).
TEST(StripMultilook, WhiteClutterKeepsItsPowerAndGainsItsLooks) {
  const auto im = white_clutter(480, 483, 11);  // 483: the range transform pads to 486
  const double inputPower = std::accumulate(im.z.begin(), im.z.end(), 0.0,
                                            [](double s, fcomplex v) { return s + std::norm(v); }) /
                            static_cast<double>(im.z.size());
  const auto d = write_slc(temp_dir("white"), im);
  for (int fa = 1; fa <= 8; ++fa) {
    for (int fr = 1; fr <= 8; ++fr) {
      if (fa != fr && fa != 1 && fr != 1 && (fa + fr) % 3 != 0) continue;  // a spread of pairs
      const Looked m = multilook(d, fa, fr);
      ASSERT_EQ(m.status, 0) << m.result.error;
      ASSERT_EQ(m.lines, looked_size(480, fa));
      ASSERT_EQ(m.samples, looked_size(483, fr));
      const double db = 10.0 * std::log10(mean_power(m.amplitude) / inputPower);
      EXPECT_LT(std::fabs(db), 0.1) << "Fa " << fa << " Fr " << fr;
      // ENL over whole looks only: the partial ones at the ends hold fewer cells.
      double s = 0.0, s2 = 0.0;
      int count = 0;
      for (int l = 0; l < 480 / fa; ++l)
        for (int c = 0; c < 483 / fr; ++c) {
          const double p = static_cast<double>(m.amplitude[l * m.samples + c]) * m.amplitude[l * m.samples + c];
          s += p;
          s2 += p * p;
          ++count;
        }
      const double mean = s / count, var = s2 / count - mean * mean;
      const double enl = mean * mean / var / (fa * fr);
      EXPECT_GE(enl, 0.9) << "Fa " << fa << " Fr " << fr;
      EXPECT_LE(enl, 1.45) << "Fa " << fa << " Fr " << fr;
    }
  }
}

// A point target at input position p lands at output position (p - (F - 1)/2) / F, the grid the
// annotation gives. On the centre of look k the image is symmetric about cell k; on the border
// of looks k - 1 and k it is symmetric about k - 1/2. Looks centred anywhere else (the first
// look starting at F/2, range cells not centred on their inputs) break the symmetry.
TEST(StripMultilook, PointTargetLandsOnItsLookCentre) {
  for (int f = 1; f <= 8; ++f) {
    const int k = 9;
    for (double offset : {0.0, -0.5}) {
      const double p = k * f + 0.5 * (f - 1) + offset * f;
      const auto im = point_target(16 * f + 8, 16 * f + 8, p, p);
      const auto d = write_slc(temp_dir("point"), im);
      const Looked m = multilook(d, f, f);
      ASSERT_EQ(m.status, 0) << m.result.error;
      auto power = [&](int l, int c) {
        const double a = m.amplitude[l * m.samples + c];
        return a * a;
      };
      // Power centroids over five looks either side of the expected position.
      const double expected = k + offset;
      const int first = static_cast<int>(std::floor(expected)) - 4, last = static_cast<int>(std::ceil(expected)) + 4;
      double sum = 0.0, az = 0.0, rg = 0.0, sumRg = 0.0;
      for (int c = first; c <= last; ++c) {
        sum += power(c, k);
        az += power(c, k) * c;
        sumRg += power(k, c);
        rg += power(k, c) * c;
      }
      if (offset != 0.0) {  // the target's line is split between two looks: take both
        sumRg = rg = 0.0;
        for (int c = first; c <= last; ++c) {
          const double pw = power(k, c) + power(k - 1, c);
          sumRg += pw;
          rg += pw * c;
        }
      }
      EXPECT_NEAR(az / sum, expected, 0.02) << "F " << f << " offset " << offset;
      EXPECT_NEAR(rg / sumRg, expected, 0.02) << "F " << f << " offset " << offset;
      // The annotation's grid puts the first output cells at the look centres.
      EXPECT_DOUBLE_EQ(m.result.firstLineTime, d.firstLine + 0.5 * (f - 1) * d.lineStep);
      EXPECT_NEAR(m.result.nearTime, d.nearTime + 0.5 * (f - 1) / d.fs, 1e-15);
      EXPECT_DOUBLE_EQ(m.result.lineStep, f * d.lineStep);
    }
  }
}

TEST(StripMultilook, WritesHeaderSidecarAndAnnotationOfTheLookedGrid) {
  const auto d = write_slc(temp_dir("files"), white_clutter(40, 50, 3), 3, 1);
  const Looked m = multilook(d, 0, 0);  // the suggested looks
  ASSERT_EQ(m.status, 0) << m.result.error;
  EXPECT_EQ(m.result.azimuthLooks, 3);
  EXPECT_EQ(m.result.rangeLooks, 1);
  EXPECT_EQ(m.lines, 14);
  EXPECT_EQ(m.samples, 50);
  const std::string out = d.dir + "/scene_pwr";
  EXPECT_TRUE(fs::exists(out + ".vrt"));
  EXPECT_FALSE(fs::exists(out + ".part"));
  const std::string a = out + "_hdr";
  base::FreeProfile(a);
  int32_t v[1] = {0};
  ASSERT_EQ(base::GetMyProfileIntArray("Processing", "NAzimuthLooks", v, a), 0);
  EXPECT_EQ(v[0], 3);
  ASSERT_EQ(base::GetMyProfileIntArray("RasterInfo", "NrOfLinesPerImage", v, a), 0);
  EXPECT_EQ(v[0], 14);
  std::string cell;
  ASSERT_EQ(base::GetMyProfileString("RasterInfo", "CellType", cell, 64, a), 0);
  EXPECT_EQ(cell, "\"FLOAT32\"");  // the profile keeps the quotes
  double step[1] = {0.0};
  ASSERT_EQ(base::GetProfileDoubleArray("Processing", "AzimuthTimeStep", step, a), 0);
  EXPECT_NEAR(step[0], 3 * d.lineStep, 1e-12);
  ASSERT_EQ(base::GetProfileDoubleArray("Processing", "PixelSpacingAz", step, a), 0);
  EXPECT_NEAR(step[0], 3 * d.spacingAz, 1e-9);
  base::FreeProfile(a);
  // Outside tools read it through the sidecar.
  if (std::system("command -v gdalinfo > /dev/null 2>&1") == 0) {
    const std::string report = d.dir + "/gdalinfo.txt";
    ASSERT_EQ(std::system(("gdalinfo " + out + ".vrt > " + report + " 2>&1").c_str()), 0);
    std::ifstream in(report);
    const std::string text((std::istreambuf_iterator<char>(in)), std::istreambuf_iterator<char>());
    EXPECT_NE(text.find("Size is 50, 14"), std::string::npos) << text;
    EXPECT_NE(text.find("Type=Float32"), std::string::npos) << text;
  }
}

TEST(StripMultilook, BadRequestsLeaveNoOutput) {
  const auto im = white_clutter(20, 30, 5);
  struct Case {
    const char* name;
    int fa, fr;
    int status;
    std::string error;
    void (*damage)(const SlcOnDisk&);
  } cases[] = {
      {"range factor", 2, -1, 10, "Fast Undersampling factor must be >=1", nullptr},
      {"azimuth factor", -3, 2, 10, "Slow Undersampling factor must be >=1", nullptr},
      {"truncated raster", 2, 2, 1, "shorter than its header",
       [](const SlcOnDisk& d) { fs::resize_file(d.slc, fs::file_size(d.slc) - 9); }},
      {"missing annotation", 2, 2, 10, "is missing", [](const SlcOnDisk& d) { fs::remove(d.slc + "_hdr"); }},
      {"annotation without grid", 2, 2, 10, "AzimuthTimeStep",
       [](const SlcOnDisk& d) {
         std::ifstream in(d.slc + "_hdr");
         std::string text, line;
         while (std::getline(in, line))
           if (line.find("AzimuthTimeStep") == std::string::npos) text += line + "\n";
         in.close();
         std::ofstream(d.slc + "_hdr", std::ios::trunc) << text;
       }},
      {"missing raster header", 2, 2, 10, "complex image", [](const SlcOnDisk& d) { fs::remove(d.slc + ".hdr"); }},
  };
  for (const auto& c : cases) {
    const auto d = write_slc(temp_dir("bad"), im);
    if (c.damage) c.damage(d);
    const Looked m = multilook(d, c.fa, c.fr);
    EXPECT_EQ(m.status, c.status) << c.name;
    EXPECT_NE(m.result.error.find(c.error), std::string::npos) << c.name << ": " << m.result.error;
    for (const char* suffix : {"", ".part", ".hdr", ".vrt", "_hdr"})
      EXPECT_FALSE(fs::exists(d.dir + "/scene_pwr" + suffix)) << c.name << " left " << suffix;
  }
}

TEST(StripMultilook, GroundRangeCellsAreEvenlySpacedOnTheEllipsoid) {
  const auto d = write_slc(temp_dir("ground"), white_clutter(40, 400, 9));
  StripMultilookRequest req;
  req.slc = d.slc;
  req.output = d.dir + "/scene_gr";
  req.azimuthLooks = 5;
  req.rangeLooks = 1;
  req.groundRange = true;
  req.groundStep = 20.0;
  StripMultilookResult res;
  ASSERT_EQ(run_strip_multilook(req, res), 0) << res.error;
  EXPECT_DOUBLE_EQ(res.rangeSpacing, 20.0);
  // Locate each ground cell through its fractional slant cell and measure its neighbours.
  SlcGrid grid;
  std::string error;
  ASSERT_EQ(read_slc_grid(d.slc + "_hdr", grid, error), 0) << error;
  ASSERT_TRUE(grid.hasOrbit);
  std::vector<double> distance;
  const double centre = grid.firstLineTime + 0.5 * 40 * grid.lineStep;
  const double step = 1.0 / grid.samplingRate;
  ASSERT_EQ(ground_distances(grid, centre, res.nearTime, step, 400, distance), 0);
  const auto where = ground_to_slant(distance, 20.0);
  ASSERT_EQ(static_cast<int>(where.size()), res.samples);
  // The slant cells are some 7.8 m / sin(23 deg) ~ 20 m apart on the ground: 400 of them
  // span about 8 km.
  EXPECT_GT(distance.back(), 5000.0);
  EXPECT_LT(distance.back(), 12000.0);
  for (std::size_t i = 0; i < where.size(); i += 37) {
    std::vector<double> one;
    // The exact ground distance of the fractional cell, from a table of its own.
    ASSERT_EQ(ground_distances(grid, centre, res.nearTime, where[i] * step / 64.0, 65, one), 0);
    EXPECT_NEAR(one.back(), 20.0 * i, 0.005 * 20.0) << i;
  }
}

}  // namespace
}  // namespace sar::multilook

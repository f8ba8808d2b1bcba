// Regions of interest: index arithmetic, intersections and their header sections.
#include <gtest/gtest.h>
#include <unistd.h>

#include <filesystem>

#include "base/profile.hpp"
#include "io/roi.hpp"

namespace sar::io {
namespace {

ROI_Obj region(double fast, double fastDelta, int samples, double slow, double slowDelta, int lines) {
  ROI_Obj r;
  r.SetFastAxe(fast, fastDelta, samples);
  r.SetSlowAxe(slow, slowDelta, lines);
  return r;
}

TEST(Roi, IndicesRoundHalfAwayFromTheStart) {
  // Steps of binary fractions, so that "half way" is exactly half way.
  const ROI_Obj r = region(0.5, 0.25, 100, 1000.0, 0.5, 40);
  struct Case {
    double time;
    int index;
  } fast[] = {{0.5, 0}, {0.625, 1}, {0.62, 0}, {0.375, -1}, {0.38, 0}, {2.4, 8}};
  for (const auto& c : fast) EXPECT_EQ(r.GetFastIndex(c.time), c.index) << c.time;
  EXPECT_EQ(r.GetSlowIndex(1001.25), 3);  // half way between lines 2 and 3
  EXPECT_EQ(r.GetSlowIndex(999.75), -1);
  EXPECT_EQ(r.GetSlowRange(2.0), 4);
  EXPECT_DOUBLE_EQ(r.slowLength, 20.0);
  EXPECT_DOUBLE_EQ(r.GetCenter().second, 1010.0);
  EXPECT_DOUBLE_EQ(r.GetDownRight().first, 0.5 + 100 * 0.25);
}

TEST(Roi, Intersections) {
  const ROI_Obj a = region(0.0, 1.0, 100, 0.0, 2.0, 50);
  struct Case {
    const char* name;
    ROI_Obj b;
    int samples, lines;
    double fastStart, slowStart;
  } cases[] = {
      {"inside", region(10.0, 0.5, 20, 10.0, 1.0, 10), 10, 5, 10.0, 10.0},
      {"overlapping the end", region(90.0, 1.0, 40, 80.0, 2.0, 40), 10, 10, 90.0, 80.0},
      {"apart", region(200.0, 1.0, 10, 0.0, 2.0, 10), 0, 0, 0.0, 0.0},
      {"touching", region(100.0, 1.0, 10, 0.0, 2.0, 10), 0, 0, 0.0, 0.0},
  };
  for (const auto& c : cases) {
    ROI_Obj r;
    ASSERT_EQ(IntersectROI(a, c.b, r), 0);
    EXPECT_EQ(r.samples, c.samples) << c.name;
    EXPECT_EQ(r.lines, c.lines) << c.name;
    EXPECT_DOUBLE_EQ(r.fastStart, c.fastStart) << c.name;
    EXPECT_DOUBLE_EQ(r.slowStart, c.slowStart) << c.name;
    EXPECT_GE(r.fastLength, 0.0) << c.name;
    EXPECT_EQ(r.isNULL(), c.samples == 0) << c.name;
  }
}

TEST(Roi, SectionsInBothDialects) {
  const auto dir = std::filesystem::temp_directory_path() / ("sar_roi_" + std::to_string(::getpid()));
  std::filesystem::create_directories(dir);
  const ROI_Obj a = region(5.5e-3, 5.2e-8, 5616, 7.0e8, 6e-4, 30000);
  for (bool xml : {false, true}) {
    const std::string file = (dir / (xml ? "roi_xml.hdr" : "roi_profile.hdr")).string();
    if (xml) {
      ROI_Obj seed;
      ASSERT_EQ(seed.writeAuxiliaryFile(file, 1, "Other"), 0);  // an XML document is there first
    }
    ROI_Obj w = a;
    ASSERT_EQ(w.write_roi(file, "ROI"), 0);
    base::FreeProfile(file);
    ROI_Obj r;
    ASSERT_TRUE(r.read_roi(file, "ROI")) << file;
    EXPECT_EQ(r.samples, 5616);
    EXPECT_EQ(r.lines, 30000);
    EXPECT_DOUBLE_EQ(r.slowStart, 7.0e8);
    EXPECT_NEAR(r.fastDelta, 5.2e-8, 1e-20);
    ROI_Obj none;
    EXPECT_FALSE(none.read_roi(file, "NoSuchSection")) << file;
  }
  std::filesystem::remove_all(dir);
}

}  // namespace
}  // namespace sar::io

// Orbit discovery over a folder that mixes the real orbit products with made-up ones: gaps,
// overlaps, the order DOR_VOR, DOR_POR, AUX_FPO, AUX_FRO, newer issues, exact boundaries, and
// files that only look like orbits by name.
#include <gtest/gtest.h>

#include "base/convert.hpp"
#include "envisat/product_types.hpp"
#include "jobs/discovery.hpp"
#include "test_standalone_support.hpp"

using namespace sar::test;
using namespace sar::jobs;

namespace {

double t(const std::string& text) { return sar::base::ascii2sec85(text); }

// A product header: the real DOR_VOR's MPH with another name and validity.
void write_header(const fs::path& file, const std::string& name, const std::string& start, const std::string& stop) {
  std::string mph = slurp(kVor).substr(0, sar::envisat::kMphSize);
  std::string padded = name;
  padded.resize(sar::envisat::kMphProductLength, ' ');
  mph.replace(sar::envisat::kMphProductOffset, padded.size(), padded);
  mph.replace(sar::envisat::kMphSensingStartOffset, start.size(), start);
  mph.replace(sar::envisat::kMphSensingStopOffset, stop.size(), stop);
  fs::create_directories(file.parent_path());
  std::ofstream(file, std::ios::binary) << mph;
}

class OrbitFolder : public ::testing::Test {
 protected:
  void SetUp() override {
    const fs::path d = job_.dir() / "orbits";
    fs::create_directories(d);
    fs::create_symlink(kVor, d / fs::path(kVor).filename());
    const std::string por = real("DOR_POR_AX", "DOR_POR_AXVF-P20080404_014700_20080401_215527_20080403_002327");
    fs::create_symlink(por, d / fs::path(por).filename());
    write_header(d / "por_march", "DOR_POR_AXVF-P20080305_000000_20080302_000000_20080304_000000",
                "02-MAR-2008 00:00:00.000000", "04-MAR-2008 00:00:00.000000");
    write_header(d / "sub" / "fpo", "AUX_FPO_AXVF-P20080310_000000_20080301_000000_20080310_000000",
                "01-MAR-2008 00:00:00.000000", "10-MAR-2008 00:00:00.000000");
    write_header(d / "fro", "AUX_FRO_AXVF-P20080301_000000_20080225_000000_20080320_000000",
                "25-FEB-2008 00:00:00.000000", "20-MAR-2008 00:00:00.000000");
    write_header(d / "vor_old", "DOR_VOR_AXVF-P20080409_000000_20080402_000000_20080403_120000",
                "02-APR-2008 00:00:00.000000", "03-APR-2008 12:00:00.000000");
    write_header(d / "vor_new", "DOR_VOR_AXVF-P20080410_000000_20080402_120000_20080404_000000",
                "02-APR-2008 12:00:00.000000", "04-APR-2008 00:00:00.000000");
    // Orbits by name only: an instrument product, an unreadable date, a short and an empty file.
    fs::copy_file(kIns, d / "DOR_VOR_AXVF-P20990101_000000_20000101_000000_20990101_000000");
    write_header(d / "bad_date", "DOR_VOR_AXVF-P20990101_000000_20000101_000000_20990101_000000",
                "01-XXX-2000 00:00:00.000000", "01-JAN-2099 00:00:00.000000");
    std::ofstream(d / "DOR_VOR_short", std::ios::binary) << "PRODUCT=\"DOR_VOR_AX";
    std::ofstream(d / "DOR_VOR_empty", std::ios::binary);
    dir_ = d.string();
  }
  ScratchJob job_{"orbit_folder"};
  std::string dir_;
};

}  // namespace

TEST_F(OrbitFolder, PicksByCoverThenPreferenceThenIssue) {
  const auto found = scan_orbit_products(dir_);
  EXPECT_EQ(found.size(), 7u);
  struct Case {
    const char* when;
    const char* expected;  // file name; null: none covers
  };
  const Case cases[] = {
      {"02-MAR-2008 12:00:00.000000", "DOR_VOR_AXVF-P20080331_075200_20080301_215527_20080303_002327"},
      {"03-MAR-2008 12:00:00.000000", "por_march"},  // the real DOR_VOR has ended: DOR_POR before AUX
      {"05-MAR-2008 00:00:00.000000", "fpo"},        // predicted before restituted
      {"15-MAR-2008 00:00:00.000000", "fro"},
      {"01-MAR-2008 21:55:27.000000", "fpo"},        // the real DOR_VOR starts exactly here
      {"02-APR-2008 06:00:00.000000", "vor_old"},    // DOR_VOR before the real DOR_POR
      {"02-APR-2008 18:00:00.000000", "vor_new"},    // two DOR_VOR: the newer issue
      {"03-APR-2008 12:00:00.000000", "vor_new"},    // the older one ends exactly here
      {"25-MAR-2008 00:00:00.000000", nullptr},      // the gap
      {"04-APR-2008 00:00:00.000000", nullptr},      // the newer one ends exactly here
      {"01-JAN-2030 00:00:00.000000", nullptr},
  };
  for (const Case& c : cases) {
    std::string error;
    const auto chosen = pick_orbit(found, t(c.when), dir_, error);
    if (c.expected) {
      ASSERT_TRUE(chosen) << c.when << ": " << error;
      EXPECT_EQ(fs::path(chosen->path).filename().string(), c.expected) << c.when;
    } else {
      EXPECT_FALSE(chosen) << c.when;
      EXPECT_NE(error.find("covers the product's sensing start " + std::string(c.when)), std::string::npos) << error;
      EXPECT_EQ(error.find('\n'), std::string::npos);
    }
  }
  // Around the gap the message names both neighbours.
  std::string error;
  pick_orbit(found, t("25-MAR-2008 00:00:00.000000"), dir_, error);
  EXPECT_NE(error.find("ends 20-MAR-2008 00:00:00.000000 (AUX_FRO_AX"), std::string::npos) << error;
  EXPECT_NE(error.find("starts 01-APR-2008 21:55:27.000000 (DOR_POR_AX"), std::string::npos) << error;
}

TEST_F(OrbitFolder, RealProductsAndFoldersWithoutOrbits) {
  std::string error;
  // The real IM products were sensed in 2011 and 2012, long after every orbit here.
  EXPECT_FALSE(find_orbit_for(kIm0, dir_, error));
  EXPECT_NE(error.find("sensing start 29-MAR-2012 07:11:34"), std::string::npos) << error;
  EXPECT_FALSE(find_orbit_for(kIm0, (job_.dir() / "nothing").string(), error));
  EXPECT_NE(error.find("holds no DOR_VOR"), std::string::npos) << error;
  EXPECT_NE(error.find("29-MAR-2012"), std::string::npos) << error;
  EXPECT_FALSE(find_orbit_for((fs::path(dir_) / "DOR_VOR_empty").string(), dir_, error));
  EXPECT_NE(error.find("cannot read the sensing start"), std::string::npos) << error;

  // A product header of 2 March 2008 against the real archive: the DOR_VOR covers it.
  const fs::path product = job_.dir() / "ASA_IM.N1";
  write_header(product, "ASA_IM__0CNPDE20080302_100000_000000012066_00338_31400_0000.N1",
              "02-MAR-2008 10:00:00.000000", "02-MAR-2008 10:00:10.000000");
  const auto chosen = find_orbit_for(product.string(), kReal.string(), error);
  ASSERT_TRUE(chosen) << error;
  EXPECT_EQ(chosen->path, kVor);
}

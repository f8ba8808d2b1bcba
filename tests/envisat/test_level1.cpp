// The level 1 reader on the real (truncated) ASA_IMS_1P products, and on copies of one of them
// with faults put into its headers and data sets.
#include <gtest/gtest.h>
#include <unistd.h>

#include <cmath>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <functional>

#include "envisat/level1.hpp"

namespace sar::envisat {
namespace {

namespace fs = std::filesystem;

const std::string kDir = std::string(SAR_REAL_DATA_DIR) + "/ASA_IMS_1P_truncated/";
const std::string kWhole = kDir + "ASA_IMS_1PNESA20040703_205338_000000182028_00172_12250_00001672562030318361237.N1";
const std::string kCutSph = kDir + "ASA_IMS_1PNPDE20090412_092427_000000162078_00079_37207_1530.N1";

constexpr std::size_t kSph = 1247;
constexpr std::size_t kFirstDsd = kSph + 1059;

std::string slurp(const std::string& p) {
  std::ifstream in(p, std::ios::binary);
  return {std::istreambuf_iterator<char>(in), std::istreambuf_iterator<char>()};
}

/// Offset in the file of DSD number `i` (0-based, in the order of the real product).
std::size_t dsd_at(int i) { return kFirstDsd + static_cast<std::size_t>(i) * 280; }
// DSD order in the real product: 0 MDS1 SQ, 1 MDS2 SQ, 2 MPP, 3 DCC, 4 SR GR, 5 CHIRP, 6 ANT1,
// 7 ANT2, 8 GEOLOCATION, 9 MAP PROJECTION, 10 MDS1, 11 MDS2, ...
constexpr int kMppDsd = 2, kChirpDsd = 5, kGeoDsd = 8, kMds1Dsd = 10;

void put_number(std::string& bytes, std::size_t at, int width, long long value) {
  char text[32];
  std::snprintf(text, sizeof text, "%+0*lld", width, value);
  bytes.replace(at, static_cast<std::size_t>(width), text);
}
void set_dsd(std::string& b, int dsd, long long offset, long long size, long long count, long long recordSize) {
  const std::size_t x = dsd_at(dsd);
  put_number(b, x + 133, 21, offset);
  put_number(b, x + 170, 21, size);
  put_number(b, x + 207, 11, count);
  put_number(b, x + 228, 11, recordSize);
}

std::string write_temp(const std::string& bytes, const std::string& name) {
  const fs::path p = fs::temp_directory_path() / ("sar_level1_" + std::to_string(::getpid()) + "_" + name);
  std::ofstream(p, std::ios::binary) << bytes;
  return p.string();
}

TEST(Level1Reader, RealImsHeadersAndAnnotation) {
  Level1Product p;
  std::string error;
  ASSERT_EQ(read_level1(kWhole, p, error), 0) << error;
  EXPECT_EQ(p.product, "ASA_IMS_1PNESA20040703_205338_000000182028_00172_12250_0000.N1");
  EXPECT_EQ(p.kind, "IMS");
  EXPECT_EQ(p.totalSize, 628159196);
  EXPECT_EQ(p.sphSize, 6099);
  EXPECT_EQ(p.descriptor, "Image Mode SLC Image");
  EXPECT_EQ(p.swath, "IS2");
  EXPECT_EQ(p.pass, "ASCENDING");
  EXPECT_EQ(p.sampleType, "COMPLEX");
  EXPECT_EQ(p.polarisation1, "V/V");
  EXPECT_EQ(p.cellType, "SHORT");
  EXPECT_EQ(p.lineLength, 5177);
  EXPECT_DOUBLE_EQ(p.rangeSpacing, 7.80397367);
  EXPECT_DOUBLE_EQ(p.lineTimeInterval, 6.05174631e-4);
  EXPECT_NEAR(p.lastLineTime - p.firstLineTime, 18.341027, 1e-5);
  EXPECT_EQ(p.channels, 1);
  ASSERT_EQ(p.dsds.size(), 18u);

  const Dsd* mpp = p.find("MAIN PROCESSING PARAMS ADS   ");
  ASSERT_NE(mpp, nullptr);
  EXPECT_EQ(mpp->offset, 7516);
  EXPECT_EQ(mpp->recordSize, 10069);
  ASSERT_EQ(p.mpp.size(), 1u);
  EXPECT_EQ(p.mpp[0].swath, "IS2");
  EXPECT_EQ(p.mpp[0].lines, 30308u);
  EXPECT_EQ(p.mpp[0].samples, 5177u);
  EXPECT_EQ(p.mpp[0].dataType, "SWORD");
  EXPECT_NEAR(p.mpp[0].rangeSpacing, 7.80397367, 1e-6);
  EXPECT_NEAR(p.mpp[0].firstTime, p.firstLineTime, 1e-6);  // SPH and MPP agree on the first line

  ASSERT_EQ(p.dcc.size(), 1u);
  EXPECT_NEAR(p.dcc[0].slantRangeTime, 5.527279e-3, 1e-9);
  EXPECT_NEAR(p.dcc[0].coefficients[0], -604.6025, 1e-3);
  EXPECT_NEAR(p.dcc[0].confidence, 0.990046, 1e-5);

  ASSERT_EQ(p.geolocation.size(), 13u);
  EXPECT_EQ(p.geolocation[0].swath, "IS2");
  EXPECT_EQ(p.geolocation[0].subSwath(), 0);
  EXPECT_EQ(p.geolocation[0].firstSample, 1u);
  EXPECT_NEAR(p.geolocation[0].firstSlantTime, 5.5259775e-3, 1e-10);
  EXPECT_NEAR(p.geolocation[0].firstIncidence, 18.71879, 1e-4);
  EXPECT_NEAR(p.geolocation[0].firstLatitude, 41.453451, 1e-6);  // the SPH's FIRST_NEAR_LAT
  EXPECT_NEAR(p.geolocation[0].firstLongitude, 11.945478, 1e-6);
  EXPECT_EQ(p.geolocation[12].lineNumber, 27985u);
  EXPECT_EQ(p.geolocation[12].lines, 2324u);

  // The MDS itself was cut off the sample: the reader says so rather than reading past the end.
  ASSERT_EQ(p.measurements().size(), 1u);
  EXPECT_EQ(check_measurements(p, error), 10);
  EXPECT_NE(error.find("MDS1 is missing"), std::string::npos) << error;
  EXPECT_EQ(check_wss_layout(p, error), 10);
  EXPECT_NE(error.find("no ASA_WSS_1P"), std::string::npos) << error;
}

TEST(Level1Reader, RealProductCutInsideItsSphIsRefused) {
  Level1Product p;
  std::string error;
  EXPECT_EQ(read_level1(kCutSph, p, error), 10);
  EXPECT_NE(error.find("shorter than its SPH"), std::string::npos) << error;
}

struct Fault {
  const char* name;
  std::function<void(std::string&)> apply;
  int status;          // of read_level1
  const char* words;   // in the error, when refused
  int mdsStatus = 0;   // of check_measurements after a good read (the real MDS is cut off: 10)
};

TEST(Level1Reader, FaultTable) {
  const std::string real = slurp(kWhole);
  ASSERT_EQ(real.size(), 25896u);
  const Fault faults[] = {
      {"level 0 product", [](std::string& b) { b.replace(9, 10, "ASA_IM__0P"); }, 10, "no ASAR level 1"},
      {"short MPH", [](std::string& b) { b.resize(1000); }, 10, "shorter than its MPH"},
      {"DSD count beyond the SPH", [](std::string& b) { put_number(b, 1140, 11, 99); }, 10, "impossible SPH"},
      {"corrupt DSD", [](std::string& b) { b.replace(dsd_at(3), 8, "XXXXXXXX"); }, 10, "DSD 4"},
      {"unknown data type", [](std::string& b) { b.replace(kSph + 1001, 5, "FLOAT"); }, 10, "data type 'FLOAT'"},
      {"no MPP", [](std::string& b) { set_dsd(b, kMppDsd, 0, 0, 0, 0); }, 10, "0 MPP"},
      {"annotation cut short", [](std::string& b) { b.resize(b.size() - 100); }, 10, "GEOLOCATION GRID ADS: the data set is shorter"},
      {"record size against size", [](std::string& b) { set_dsd(b, kGeoDsd, 19123, 6773, 12, 521); }, 10, "out of range"},
      {"MPP records of 2009 bytes, stepped by their own size",
       [](std::string& b) {
         set_dsd(b, kMppDsd, 7516, 2 * 2009, 2, 2009);
         std::string second = b.substr(7516, 69);
         second[41 + 2] = '3';         // "IS3"
         b.replace(7516 + 2009, 69, second);
       },
       0, "", 10},
      {"DSDs in another order",
       [](std::string& b) {
         const std::string mpp = b.substr(dsd_at(kMppDsd), 280), chirp = b.substr(dsd_at(kChirpDsd), 280);
         b.replace(dsd_at(kMppDsd), 280, chirp);
         b.replace(dsd_at(kChirpDsd), 280, mpp);
       },
       0, "", 10},
      {"MDS shorter than its DSD",
       [](std::string& b) { set_dsd(b, kMds1Dsd, 19123, 2 * 20725, 2, 20725); }, 0, "", 10},
      {"MDS inside the file", [](std::string& b) { set_dsd(b, kMds1Dsd, 7516, 2 * 2000, 2, 2000); }, 0, "", 0},
  };
  for (const auto& f : faults) {
    std::string bytes = real;
    f.apply(bytes);
    const std::string path = write_temp(bytes, "fault");
    Level1Product p;
    std::string error;
    const int st = read_level1(path, p, error);
    EXPECT_EQ(st, f.status) << f.name << ": " << error;
    if (f.status != 0) {
      EXPECT_NE(error.find(f.words), std::string::npos) << f.name << ": " << error;
    } else if (st == 0) {
      EXPECT_EQ(p.find("MAIN PROCESSING PARAMS ADS")->offset, 7516) << f.name;
      EXPECT_EQ(check_measurements(p, error), f.mdsStatus) << f.name << ": " << error;
      if (std::string(f.name).find("2009") != std::string::npos) {
        ASSERT_EQ(p.mpp.size(), 2u);
        EXPECT_EQ(p.mpp[1].swath, "IS3");
        EXPECT_EQ(p.mpp[1].lines, 30308u);
      }
    }
    fs::remove(path);
  }
}

}  // namespace
}  // namespace sar::envisat

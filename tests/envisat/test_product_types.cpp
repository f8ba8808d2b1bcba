#include <gtest/gtest.h>

#include <filesystem>
#include <fstream>
#include <map>

#include "envisat/product_types.hpp"

namespace fs = std::filesystem;
using sar::envisat::EnvisatTypes;

namespace {

const fs::path kReal = SAR_REAL_DATA_DIR;

std::string first_file(const char* folder) {
  for (const auto& e : fs::directory_iterator(kReal / folder)) return e.path().string();
  return {};
}

// A copy of a real product header whose sensing start is replaced, in a scratch folder.
std::string product_with_start(const std::string& source, const std::string& start27, const fs::path& dir) {
  std::ifstream in(source, std::ios::binary);
  std::string bytes((std::istreambuf_iterator<char>(in)), std::istreambuf_iterator<char>());
  bytes.replace(sar::envisat::kMphSensingStartOffset, start27.size(), start27);
  const fs::path out = dir / "product.N1";
  std::ofstream(out, std::ios::binary) << bytes;
  return out.string();
}

}  // namespace

TEST(ProductTypes, EveryRealFileIsTypedByItsHeader) {
  // The ERS calibration files carry an ASA_XCA product name in their MPH, so by header they
  // are calibration products; the processor configuration and CEOS files are no input type.
  const std::map<std::string, int> expected = {
      {"ASA_CON_AX", 0},  {"ASA_IMS_1P_truncated", 7}, {"ASA_IM__0P_truncated", 8}, {"ASA_INS_AX", 16},
      {"ASA_XCA_AX", 14}, {"ASA_XCH_AX", 15},          {"DOR_POR_AX", 13},          {"DOR_VOR_AX", 12},
      {"ERS_XCA_AX", 14}, {"RADARSAT1_CEOS", 0}};
  int files = 0;
  for (const auto& folder : fs::directory_iterator(kReal)) {
    if (!folder.is_directory()) {
      EXPECT_EQ(EnvisatTypes(folder.path().string()).find_type(), 0) << folder.path();
      continue;
    }
    const auto it = expected.find(folder.path().filename().string());
    ASSERT_NE(it, expected.end()) << "no expectation for " << folder.path();
    for (const auto& f : fs::directory_iterator(folder.path())) {
      EnvisatTypes t(f.path().string());
      EXPECT_EQ(t.find_type(), it->second) << f.path();
      ++files;
    }
  }
  EXPECT_EQ(files, 87);  // every sample product, none skipped
}

TEST(ProductTypes, NamedTestsAgreeWithFindType) {
  EnvisatTypes im0(first_file("ASA_IM__0P_truncated"));
  EXPECT_TRUE(im0.is_im0());
  EXPECT_FALSE(im0.is_ims());
  EXPECT_FALSE(im0.is_ws0());
  EnvisatTypes vor(first_file("DOR_VOR_AX"));
  EXPECT_TRUE(vor.is_dorvor());
  EXPECT_FALSE(vor.is_dorpor());
  EXPECT_TRUE(EnvisatTypes(first_file("DOR_POR_AX")).is_dorpor());
  EXPECT_TRUE(EnvisatTypes(first_file("ASA_INS_AX")).is_ins());
  EXPECT_TRUE(EnvisatTypes(first_file("ASA_XCH_AX")).is_xch());
  EXPECT_FALSE(EnvisatTypes(first_file("ASA_CON_AX")).is_xca());
}

TEST(ProductTypes, UnreadableShortOrForeignFilesAreUnknown) {
  const fs::path dir = fs::temp_directory_path() / ("types_" + std::to_string(::getpid()));
  fs::create_directories(dir);
  struct Case {
    const char* name;
    std::string bytes;
  };
  const Case cases[] = {
      {"empty", ""},
      {"short", "PRODUCT=\"ASA_IM__0"},  // ends inside the product name field
      {"ASA_IM__0CNPDE_named_but_text", std::string(200, 'x')},
      {"padded", "PRODUCT=\"   ASA_INS_AX" + std::string(100, ' ')},  // %62s skips leading blanks
  };
  for (const auto& c : cases) std::ofstream(dir / c.name, std::ios::binary) << c.bytes;
  EXPECT_EQ(EnvisatTypes((dir / "missing").string()).find_type(), 0);
  EXPECT_EQ(EnvisatTypes((dir / "empty").string()).find_type(), 0);
  EXPECT_EQ(EnvisatTypes((dir / "short").string()).find_type(), 0);
  EXPECT_EQ(EnvisatTypes((dir / "ASA_IM__0CNPDE_named_but_text").string()).find_type(), 0);
  EXPECT_EQ(EnvisatTypes((dir / "padded").string()).find_type(), 16);
  fs::remove_all(dir);
}

TEST(ProductTypes, OrbitValidityMustStrictlyHoldTheSensingStart) {
  const fs::path dir = fs::temp_directory_path() / ("dorvor_" + std::to_string(::getpid()));
  fs::create_directories(dir);
  const std::string im0 = first_file("ASA_IM__0P_truncated");
  const std::string vor = first_file("DOR_VOR_AX");  // 01-MAR-2008 21:55:27 to 03-MAR-2008 00:23:27
  EXPECT_EQ(EnvisatTypes(im0).check_dorvor(vor), 0);  // sensed in 2011/2012
  struct Case {
    const char* start;
    int expected;
  };
  for (Case c : {Case{"02-MAR-2008 10:00:00.000000", 1}, Case{"01-MAR-2008 21:55:27.000000", 0},
                 Case{"01-MAR-2008 21:55:27.000001", 1}, Case{"03-MAR-2008 00:23:27.000000", 0},
                 Case{"29-FEB-2008 23:00:00.000000", 0}}) {
    const std::string p = product_with_start(im0, c.start, dir);
    EXPECT_EQ(EnvisatTypes(p).check_dorvor(vor), c.expected) << c.start;
  }
  // Only ASAR products (codes 1-11) are checked against an orbit.
  EXPECT_EQ(EnvisatTypes(first_file("ASA_INS_AX")).check_dorvor(vor), 0);
  EXPECT_EQ(EnvisatTypes(product_with_start(im0, "02-MAR-2008 10:00:00.000000", dir)).check_dorvor(
                (dir / "no_orbit").string()),
            0);
  fs::remove_all(dir);
}

// Auxiliary lookup by the product's sensing start, over hand-made indexes and the real archive.
#include <gtest/gtest.h>

#include "base/profile.hpp"
#include "job_harness.hpp"
#include "jobs/aux_lookup.hpp"

using namespace sar::test;
using sar::jobs::find_aux;

namespace {

class AuxLookup : public ::testing::Test {
 protected:
  void SetUp() override {
    dir_ = fs::temp_directory_path() / ("auxlookup_" + std::to_string(::getpid()));
    fs::remove_all(dir_);
    fs::create_directories(dir_);
    des_ = dir_.string() + "/";
  }
  void TearDown() override {
    sar::base::FreeProfile();
    fs::remove_all(dir_);
  }
  // A product whose MPH sensing start is `start`.
  std::string product(const std::string& start) const {
    std::string mph(400, ' ');
    mph.replace(351, start.size(), start);
    const fs::path p = dir_ / "product.N1";
    std::ofstream(p, std::ios::binary) << mph;
    return p.string();
  }
  void index(const std::string& text) const {
    sar::base::FreeProfile();
    std::ofstream(dir_ / "ASA_AUX_list.dat") << text;
  }
  fs::path dir_;
  std::string des_;
};

const char* kIndex =
    "[ASA_INS_0]\nStartDate = 01-JAN-2005 00:00:00.000000\nStopDate = 31-DEC-2005 00:00:00.000000\n"
    "FileName = ins_a\n"
    "[ASA_INS_1]\nStartDate = 01-JUN-2005 00:00:00.000000\nStopDate = 31-DEC-2006 00:00:00.000000\n"
    "FileName = ins_b\n"
    "[ASA_INS_2]\nStartDate = 01-JAN-2008 00:00:00.000000\nFileName = ins_instant\n"
    "[ASA_INS_4]\nStartDate = 01-JAN-2009 00:00:00.000000\nStopDate = 31-DEC-2009 00:00:00.000000\n"
    "FileName = ins_behind_gap\n";

}  // namespace

TEST_F(AuxLookup, FirstEntryWhosePeriodHoldsTheDateWins) {
  index(kIndex);
  struct Case {
    const char* date;
    int status;
    const char* file;
  };
  for (Case c : {Case{"01-JAN-2005 00:00:00.000000", 0, "ins_a"},        // start is inclusive
                 Case{"31-DEC-2005 00:00:00.000000", 0, "ins_a"},        // stop is inclusive; overlap: lower wins
                 Case{"31-DEC-2005 00:00:00.000001", 0, "ins_b"},
                 Case{"01-JAN-2008 00:00:00.000000", 0, "ins_instant"},  // no stop: one instant
                 Case{"01-JAN-2008 00:00:01.000000", 10, nullptr},
                 Case{"01-JUL-2009 00:00:00.000000", 10, nullptr},       // hidden behind the gap at index 3
                 Case{"01-JAN-2004 00:00:00.000000", 10, nullptr}}) {
    std::string result = "untouched";
    EXPECT_EQ(find_aux(product(c.date), des_, "ASA_INS", result), c.status) << c.date;
    if (c.file) {
      EXPECT_EQ(result, des_ + c.file) << c.date;
    }
  }
  std::string r;
  EXPECT_EQ(find_aux(product("01-JAN-2005 00:00:00.000000"), des_, "ASA_XCA", r), 10);  // no XCA entries
}

TEST_F(AuxLookup, MissingIndexOrProduct) {
  std::string r;
  EXPECT_EQ(find_aux(product("01-JAN-2005 00:00:00.000000"), des_, "ASA_INS", r), 10);
  EXPECT_EQ(find_aux((dir_ / "missing.N1").string(), des_, "ASA_INS", r), ENOENT);
}

TEST_F(AuxLookup, RealArchiveIsIndexedAndServesTheRealProducts) {
  const auto entries = sar::jobs::scan_aux_products({kReal.string()});
  int ins = 0, xca = 0, xch = 0;
  for (const auto& e : entries) {
    ins += e.kind == "ASA_INS";
    xca += e.kind == "ASA_XCA";
    xch += e.kind == "ASA_XCH";
    EXPECT_EQ(e.path.find("ERS_XCA"), std::string::npos) << "ERS file indexed: " << e.path;
  }
  EXPECT_EQ(ins, 13);
  EXPECT_EQ(xca, 55);
  EXPECT_EQ(xch, 1);
  sar::jobs::write_aux_index(entries, des_);

  // Both real IM products were sensed in 2011/2012: the newest ASA_INS issue valid then wins.
  std::string r;
  ASSERT_EQ(find_aux(kIm0, des_, "ASA_INS", r), 0);
  EXPECT_EQ(fs::path(r).filename(), "ASA_INS_AXVIEC20110124_114858_20101228_112000_20141231_235959");
  EXPECT_TRUE(fs::exists(r));
  ASSERT_EQ(find_aux(kIm0, des_, "ASA_XCA", r), 0);
  EXPECT_TRUE(fs::exists(r));
  EXPECT_NE(r.find("ASA_XCA_AX"), std::string::npos);
  ASSERT_EQ(find_aux(kIm0, des_, "ASA_XCH", r), 0);
  EXPECT_TRUE(fs::exists(r));

  // The index read back names the same files.
  const auto back = sar::jobs::read_aux_index(des_);
  ASSERT_EQ(back.size(), entries.size());
  for (std::size_t i = 0; i < back.size(); ++i) EXPECT_TRUE(fs::equivalent(back[i].path, entries[i].path));
}

// Standalone use: orbit discovery, parameter overrides and the outcome of sarfocus runs.
#include <gtest/gtest.h>

#include "base/convert.hpp"
#include "job_harness.hpp"
#include "jobs/discovery.hpp"
#include "jobs/standalone.hpp"

using namespace sar::test;
using namespace sar::jobs;

namespace {

double t(const char* text) { return sar::base::ascii2sec85(text); }

OrbitCandidate orbit(const char* name, int pref, const char* start, const char* stop) {
  return {std::string("/orbits/") + name, name, pref, t(start), t(stop)};
}

std::string focussing_exe() { return SAR_FOCUSSING_EXE; }

}  // namespace

TEST(Discovery, ChoosesTheCoveringOrbitByPreferenceThenIssue) {
  const std::vector<OrbitCandidate> all = {
      orbit("DOR_POR_A", 1, "01-MAR-2008 00:00:00.000000", "03-MAR-2008 00:00:00.000000"),
      orbit("DOR_VOR_A", 0, "01-MAR-2008 12:00:00.000000", "02-MAR-2008 12:00:00.000000"),
      orbit("DOR_VOR_B", 0, "01-MAR-2008 18:00:00.000000", "02-MAR-2008 18:00:00.000000"),
      orbit("AUX_FRO_A", 3, "01-JAN-2008 00:00:00.000000", "31-DEC-2008 00:00:00.000000"),
      orbit("AUX_FPO_A", 2, "01-APR-2008 00:00:00.000000", "10-APR-2008 00:00:00.000000"),
  };
  struct Case {
    const char* when;
    const char* expected;  // null: none covers
  };
  for (Case c : {Case{"01-MAR-2008 06:00:00.000000", "DOR_POR_A"},   // only the preliminary covers it
                 Case{"01-MAR-2008 13:00:00.000000", "DOR_VOR_A"},   // precise before preliminary
                 Case{"02-MAR-2008 06:00:00.000000", "DOR_VOR_B"},   // two precise: the newer issue
                 Case{"02-MAR-2008 12:00:00.000000", "DOR_VOR_B"},   // VOR_A ends exactly here: excluded
                 Case{"05-APR-2008 00:00:00.000000", "AUX_FPO_A"},   // predicted before restituted
                 Case{"05-MAY-2008 00:00:00.000000", "AUX_FRO_A"},
                 Case{"05-MAY-2009 00:00:00.000000", nullptr}}) {
    const auto chosen = choose_orbit(all, t(c.when));
    if (!c.expected) {
      EXPECT_FALSE(chosen) << c.when;
    } else {
      ASSERT_TRUE(chosen) << c.when;
      EXPECT_EQ(chosen->name, c.expected) << c.when;
    }
  }
}

TEST(Discovery, RealOrbitFilesAreFoundByHeader) {
  const auto found = scan_orbit_products(kReal.string());
  ASSERT_EQ(found.size(), 2u);
  const auto vor = choose_orbit(found, t("02-MAR-2008 00:00:00.000000"));
  ASSERT_TRUE(vor);
  EXPECT_EQ(vor->preference, 0);
  EXPECT_EQ(vor->path, kVor);
  const auto por = choose_orbit(found, t("02-APR-2008 00:00:00.000000"));
  ASSERT_TRUE(por);
  EXPECT_EQ(por->preference, 1);
  EXPECT_FALSE(choose_orbit(found, t("29-MAR-2012 07:11:34.000000")));
}

TEST(Standalone, ParameterOverrides) {
  ScratchJob job("overrides");
  job.layout();
  const std::string params = (job.dir() / "des" / "parameters_IM.hdr").string();
  EXPECT_EQ(apply_parameter_overrides(params, {"Azblk=1024", "AzimuthConf.StoltPadding = 1.25"}), "");
  const std::string text = slurp(params);
  EXPECT_NE(text.find("Azblk = 1024\n"), std::string::npos);
  EXPECT_NE(text.find("StoltPadding = 1.25\n"), std::string::npos);
  EXPECT_NE(apply_parameter_overrides(params, {"NoSuchKey=1"}), "");
  EXPECT_NE(apply_parameter_overrides(params, {"DCestConf.Azblk=1"}), "");  // wrong section
  EXPECT_NE(apply_parameter_overrides(params, {"Azblk"}), "");
}

TEST(Standalone, BadInputsGiveOneClearLineAndWriteNothing) {
  ScratchJob job("standalone_bad");
  fs::create_directories(job.dir());
  const std::string out = (job.dir() / "out").string();
  struct Case {
    const char* name;
    StandaloneRequest req;
    const char* says;
  };
  StandaloneRequest base;
  base.product = kIm0;
  base.outDir = out;
  std::vector<Case> cases;
  {
    auto r = base;
    r.product = "/nowhere/product.N1";
    cases.push_back({"missing product", r, "product not found: /nowhere/product.N1"});
  }
  {
    auto r = base;
    r.mode = "xx";
    cases.push_back({"unknown mode", r, "unknown mode 'xx'"});
  }
  {
    auto r = base;
    r.orbit = kReal.string();
    cases.push_back({"no covering orbit", r, "covers the product's sensing start 29-MAR-2012 07:11:34"});
  }
  {
    auto r = base;
    r.outDir = kIm0 + "/sub";  // below a file: cannot be created
    cases.push_back({"unwritable output", r, "is not writable"});
  }
  for (const auto& c : cases) {
    const StandaloneOutcome o = run_standalone(c.req, focussing_exe(), nullptr);
    EXPECT_NE(o.status, 0) << c.name;
    EXPECT_NE(o.summary.find(c.says), std::string::npos) << c.name << ": " << o.summary;
    EXPECT_EQ(o.summary.find('\n'), std::string::npos) << c.name;
    EXPECT_TRUE(!fs::exists(out) || fs::is_empty(out)) << c.name;
  }
}

TEST(Standalone, RunsFocussingAndSumsUpItsErrorRecord) {
  ScratchJob job("standalone_run");
  fs::create_directories(job.dir());
  StandaloneRequest r;
  r.product = kIm0;
  r.orbit = kVor;
  r.outDir = (job.dir() / "out").string();
  const StandaloneOutcome o = run_standalone(r, focussing_exe(), nullptr);
  // The real product ends inside its first packet: the extraction stops with the file error.
  EXPECT_EQ(o.status, 20);
  EXPECT_NE(o.summary.find("File input/output error [EC : 1305606]"), std::string::npos) << o.summary;
  EXPECT_NE(o.summary.find("Vanterra.log"), std::string::npos);
  EXPECT_TRUE(o.products.empty());
  EXPECT_TRUE(fs::exists(fs::path(o.workDir) / "Vanterra.log"));
}

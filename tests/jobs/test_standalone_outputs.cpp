// What sarfocus does around a job, with a stand-in for focussing that speaks the same file
// protocol: products moved into the output folder only on success, the completion marker and
// what counts as complete, error records read back into one line, and a batch's bookkeeping.
#include <gtest/gtest.h>
#include <sys/stat.h>

#include "jobs/batch.hpp"
#include "test_standalone_support.hpp"

using namespace sar::test;
using namespace sar::jobs;

namespace {

// Reads the job list like a job; the product's file name picks the outcome.
constexpr const char* kStandIn = R"sh(#!/bin/bash
mapfile -t a < "${1#*#}"
root="${a[5]}"
case "$(basename "${a[1]}")" in
  fail*)
    d=/a/rather/long/folder/name/that/the/error/record/wraps/over/more/than/one/line/DOR_VOR_AX
    printf -- '-1\nFILE ERROR\nFile not found [EC : 261122]\n%s\n%s\n%s\n\n' "${d:0:48}" "${d:48:48}" "${d:96}" \
      > Vanterra.working_error
    exit 20 ;;
  unbuilt*)
    echo "PROCESSING ERROR: XYZprocessor: stage not available in this build - line : 1" > Vanterra.log
    printf -- '-1\nPROCESSING ERROR\nA PROCESSING STAGE FAILED [EC : 130560]\nXYZprocessor()\n' > Vanterra.working_error
    exit 2 ;;
  *)
    printf 'complex' > "${root}_slc"; printf 'header' > "${root}_slc_hdr"; printf 'raw' > EXTR
    if [ "${a[13]}" = OK ]; then printf 'tiff' > "${root}_slc.tif"; fi
    exit 0 ;;
esac
)sh";

class StandIn : public ::testing::Test {
 protected:
  void SetUp() override {
    fs::create_directories(job_.dir() / "in");
    exe_ = (job_.dir() / "focussing").string();
    std::ofstream(exe_) << kStandIn;
    ::chmod(exe_.c_str(), 0755);
  }
  std::string product(const std::string& name) const {
    const fs::path p = job_.dir() / "in" / name;
    std::ofstream(p) << "level 0";
    return p.string();
  }
  StandaloneRequest request(const std::string& name) const {
    StandaloneRequest r;
    r.product = product(name);
    r.outDir = (job_.dir() / "out").string();
    return r;
  }
  ScratchJob job_{"standin"};
  std::string exe_;
};

std::vector<std::string> entries(const fs::path& dir) {
  std::vector<std::string> names;
  for (const auto& e : fs::directory_iterator(dir)) names.push_back(e.path().filename().string());
  std::sort(names.begin(), names.end());
  return names;
}

}  // namespace

TEST_F(StandIn, SuccessMovesProductsInAndMarksThemComplete) {
  StandaloneRequest r = request("good.N1");
  const StandaloneOutcome o = run_standalone(r, exe_, nullptr);
  ASSERT_EQ(o.status, 0) << o.summary;
  EXPECT_EQ(o.result, StandaloneResult::kDone);
  const fs::path out = r.outDir;
  EXPECT_EQ(entries(out), (std::vector<std::string>{".sarfocus", "good_slc", "good_slc.tif", "good_slc_hdr"}));
  EXPECT_EQ(o.slc, (out / "good_slc").string());
  EXPECT_FALSE(fs::exists(fs::path(o.workDir) / "EXTR"));  // work rasters go once the products stand
  EXPECT_TRUE(outputs_complete(r));

  // Completeness asks for what this request wants and for the sizes the marker recorded.
  r.mode = "ap";
  EXPECT_FALSE(outputs_complete(r));
  r.mode = "im";
  std::ofstream(out / "good_slc", std::ios::app) << "more";
  EXPECT_FALSE(outputs_complete(r));
  ASSERT_EQ(run_standalone(r, exe_, nullptr).status, 0);
  EXPECT_TRUE(outputs_complete(r));
  fs::remove(out / "good_slc.tif");
  EXPECT_FALSE(outputs_complete(r));
  r.quickLook = false;
  EXPECT_TRUE(outputs_complete(r));
  fs::remove(fs::path(o.workDir) / kCompletionMarker);
  EXPECT_FALSE(outputs_complete(r));

  // Skipping complete outputs does not run the job.
  ASSERT_EQ(run_standalone(r, exe_, nullptr).result, StandaloneResult::kDone);
  const auto before = fs::last_write_time(out / "good_slc");
  r.skipComplete = true;
  const StandaloneOutcome again = run_standalone(r, "/nowhere/focussing", nullptr);
  EXPECT_EQ(again.result, StandaloneResult::kSkipped) << again.summary;
  EXPECT_EQ(again.status, 0);
  EXPECT_EQ(fs::last_write_time(out / "good_slc"), before);
}

TEST_F(StandIn, FailuresSayTheirRecordInOneLineAndWriteNoProduct) {
  const StandaloneOutcome failed = run_standalone(request("fail.N1"), exe_, nullptr);
  EXPECT_EQ(failed.status, 20);
  EXPECT_EQ(failed.result, StandaloneResult::kFailed);
  // The detail that the record wrapped comes back whole.
  EXPECT_EQ(failed.error,
            "FILE ERROR: File not found [EC : 261122] "
            "/a/rather/long/folder/name/that/the/error/record/wraps/over/more/than/one/line/DOR_VOR_AX");
  EXPECT_NE(failed.summary.find("; log: " + failed.workDir + "/Vanterra.log"), std::string::npos);
  EXPECT_EQ(entries(job_.dir() / "out"), std::vector<std::string>{".sarfocus"});

  const StandaloneOutcome unbuilt = run_standalone(request("unbuilt.N1"), exe_, nullptr);
  EXPECT_EQ(unbuilt.status, kExitNotBuilt);
  EXPECT_EQ(unbuilt.error,
            "mode 'im' is not available in this build yet: the job stopped at XYZprocessor (stage not available in "
            "this build)");
  EXPECT_FALSE(fs::exists(unbuilt.workDir.empty() ? job_.dir() / "out/.sarfocus/unbuilt" : fs::path(unbuilt.workDir)));

  const StandaloneOutcome missing = run_standalone(request("good.N1"), "/nowhere/focussing", nullptr);
  EXPECT_EQ(missing.error, "cannot run /nowhere/focussing");
  EXPECT_NE(missing.status, 0);
}

TEST_F(StandIn, BatchRunsEveryProductOnceAndTabulates) {
  BatchRequest b;
  b.common.outDir = (job_.dir() / "out").string();
  b.jobs = 2;
  const std::string twin = (job_.dir() / "twin").string();
  fs::create_directories(twin);
  std::ofstream(twin + "/good.N1") << "level 0";
  const std::vector<std::string> products = {product("good.N1"), product("fail.N1"), twin + "/good.N1",
                                             (job_.dir() / "in" / "absent.N1").string(), product("other.N1")};
  const auto items = run_batch(b, products, exe_, nullptr);
  ASSERT_EQ(items.size(), products.size());
  EXPECT_EQ(items[0].outcome.result, StandaloneResult::kDone);
  EXPECT_EQ(items[1].outcome.result, StandaloneResult::kFailed);
  EXPECT_EQ(items[2].outcome.result, StandaloneResult::kBadRequest);  // same name as the first
  EXPECT_NE(items[2].outcome.error.find("same product name as " + products[0]), std::string::npos);
  EXPECT_NE(items[3].outcome.error.find("product not found"), std::string::npos);
  EXPECT_EQ(items[4].outcome.result, StandaloneResult::kDone);
  EXPECT_EQ(batch_status(items), 1);

  const std::string table = batch_summary(items);
  std::istringstream lines(table);
  std::vector<std::string> rows;
  for (std::string l; std::getline(lines, l);) rows.push_back(l);
  ASSERT_EQ(rows.size(), 7u) << table;
  EXPECT_EQ(rows[0].find("PRODUCT"), 0u);
  EXPECT_NE(rows[1].find("done"), std::string::npos);
  EXPECT_NE(rows[1].find(b.common.outDir + "/good_slc"), std::string::npos);
  EXPECT_NE(rows[2].find("FAILED"), std::string::npos);
  EXPECT_NE(rows[2].find("File not found [EC : 261122]"), std::string::npos);
  EXPECT_EQ(rows[6], "5 products: 2 done, 0 skipped as complete, 3 failed");

  // A second run leaves the complete ones alone.
  const auto again = run_batch(b, {products[0], products[4]}, exe_, nullptr);
  EXPECT_EQ(again[0].outcome.result, StandaloneResult::kSkipped);
  EXPECT_EQ(again[1].outcome.result, StandaloneResult::kSkipped);
  EXPECT_EQ(batch_status(again), 0);
}

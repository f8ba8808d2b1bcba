// Eight products, four jobs at a time, one output folder: two products are corrupt (one cut
// short, one with its packet heads overwritten). The six good ones must come out byte for byte
// as single runs make them, the two bad ones must report their errors, and nothing else may be
// left in the output folder.
#include <gtest/gtest.h>

#include <map>
#include <set>

#include "jobs/batch.hpp"
#include "test_standalone_support.hpp"

using namespace sar::test;
using namespace sar::jobs;

namespace {

std::vector<std::string> common_args(const fs::path& in, const fs::path& out) {
  std::vector<std::string> a = {"--orbit", in.string(), "--aux", in.string(), "--out", out.string(), "--quicklook", "64x64"};
  for (const auto& p : kSmallSceneParams) {
    a.push_back("--param");
    a.push_back(p);
  }
  return a;
}

// File name to bytes, for the files of the output folder itself. Nothing in a product names the
// folder it was written in, so the bytes are compared as they are.
std::map<std::string, std::string> products_in(const fs::path& out) {
  std::map<std::string, std::string> files;
  for (const auto& e : fs::directory_iterator(out)) {
    if (!e.is_regular_file()) continue;
    files[e.path().filename().string()] = slurp(e.path());
  }
  return files;
}

}  // namespace

TEST(BatchOfEight, FourAtATimeSameBytesAsSingleRunsBadOnesReported) {
  ScratchJob job("batch8");
  const fs::path in = job.dir() / "in";
  std::vector<std::string> products;
  // Two days apart, so that each orbit file covers its own product only.
  for (int k = 0; k < 8; ++k) {
    char day[40];
    std::snprintf(day, sizeof day, "%02d-MAR-2008 10:00:00.000000", 2 + 2 * k);
    products.push_back(simulate_small(in, day).level0_path);
  }
  // Corrupt: the fourth cut inside its packets, the seventh with every byte after the headers
  // and the first packets overwritten.
  fs::resize_file(products[3], 20000);
  {
    std::fstream f(products[6], std::ios::in | std::ios::out | std::ios::binary);
    f.seekp(3203 + 200000);
    const std::string junk(fs::file_size(products[6]) - 3203 - 200000, '\x5a');
    f.write(junk.data(), static_cast<std::streamsize>(junk.size()));
  }
  const std::set<std::size_t> bad = {3, 6};
  const std::string list = (job.dir() / "products.txt").string();
  {
    std::ofstream l(list);
    for (const auto& p : products) l << p << "\n";
  }

  const fs::path out = job.dir() / "out";
  std::vector<std::string> args = {"batch", list, "--jobs", "4"};
  const auto common = common_args(in, out);
  args.insert(args.end(), common.begin(), common.end());
  const CliResult batch = sarfocus(args);
  EXPECT_EQ(batch.status, 1) << batch.out << batch.err;

  const auto together = products_in(out);
  std::set<std::string> expected;
  for (std::size_t k = 0; k < products.size(); ++k) {
    const std::string stem = product_stem(products[k]);
    SCOPED_TRACE(stem);
    // The batch's table names each product once, with its outcome.
    const auto row = batch.out.find(fs::path(products[k]).filename().string());
    ASSERT_NE(row, std::string::npos) << batch.out;
    const std::string line = batch.out.substr(row, batch.out.find('\n', row) - row);
    if (bad.count(k)) {
      EXPECT_NE(line.find(" FAILED "), std::string::npos) << line;
      EXPECT_NE(line.find("[EC : "), std::string::npos) << line;
      EXPECT_TRUE(fs::exists(out / ".sarfocus" / stem / "Vanterra.working_error"));
      continue;
    }
    EXPECT_NE(line.find(" done "), std::string::npos) << line;
    // The same product alone, into a folder of its own.
    const fs::path single = job.dir() / ("single" + std::to_string(k));
    std::vector<std::string> one = {"im", products[k]};
    const auto c = common_args(in, single);
    one.insert(one.end(), c.begin(), c.end());
    const CliResult alone = sarfocus(one);
    ASSERT_EQ(alone.status, 0) << alone.err;
    const auto mine = products_in(single);
    ASSERT_FALSE(mine.empty());
    for (const auto& [name, bytes] : mine) {
      expected.insert(name);
      const auto it = together.find(name);
      ASSERT_NE(it, together.end()) << name;
      EXPECT_TRUE(it->second == bytes) << name << " differs from the single run";
    }
  }
  // Nothing else: every file of the output folder belongs to a good product, and its working
  // folders are the only folder.
  for (const auto& [name, bytes] : together) EXPECT_TRUE(expected.count(name)) << "left behind: " << name;
  for (const auto& e : fs::directory_iterator(out)) {
    if (e.is_directory()) {
      EXPECT_EQ(e.path().filename(), ".sarfocus");
    }
  }
}

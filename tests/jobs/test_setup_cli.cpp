// focussing --setup and --aux-index on their command lines: a laid-out job list from the
// arguments given, and refusals that lay out nothing.
#include <gtest/gtest.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>
#include <string>
#include <vector>

#include "jobs/setup.hpp"

namespace fs = std::filesystem;

namespace {

int run(int (*main_of)(int, char**), std::vector<std::string> words) {
  std::vector<char*> argv;
  for (auto& w : words) argv.push_back(w.data());
  argv.push_back(nullptr);
  return main_of(static_cast<int>(words.size()), argv.data());
}

std::vector<std::string> lines_of(const fs::path& p) {
  std::vector<std::string> out;
  std::ifstream in(p);
  for (std::string l; std::getline(in, l);) out.push_back(l);
  return out;
}

class SetupCli : public ::testing::Test {
 protected:
  void SetUp() override {
    dir_ = fs::temp_directory_path() / ("setup_cli_" + std::to_string(::getpid()));
    fs::remove_all(dir_);
    fs::create_directories(dir_);
  }
  void TearDown() override { fs::remove_all(dir_); }
  fs::path dir_;
};

}  // namespace

TEST_F(SetupCli, ArgumentsLandInTheJobList) {
  const fs::path job = dir_ / "job";
  ASSERT_EQ(run(sar::jobs::setup_main, {job.string(), "--mode", "RS", "--arg", "0=/data/p", "--arg=3=77", "--trace",
                                        "--arg", "13=2.5"}),
            0);
  const auto list = lines_of(job / "job.txt");
  ASSERT_GE(list.size(), 15u);
  EXPECT_NE(list[0].find("main_focussing_asar_RS#"), std::string::npos) << list[0];
  EXPECT_EQ(list[1], "/data/p");
  EXPECT_EQ(list[2], "NotOK");
  EXPECT_EQ(list[4], "77");
  EXPECT_EQ(list[14], "2.5");
  const auto ini = lines_of(job / "Vanterra_configuration.ini");
  ASSERT_GE(ini.size(), 12u);
  EXPECT_EQ(ini[11], "ACTIVE");
}

TEST_F(SetupCli, RefusalsLayOutNothing) {
  const std::string job = (dir_ / "job").string();
  const std::vector<std::vector<std::string>> cases = {
      {},
      {job, "--mode", "XX"},
      {job, "--arg", "14=x"},
      {job, "--arg", "3"},
      {job, "--arg"},
      {job, "--bogus"},
      {job, "other"},
  };
  for (const auto& words : cases) {
    EXPECT_EQ(run(sar::jobs::setup_main, words), 2) << (words.empty() ? "(none)" : words.back());
    EXPECT_FALSE(fs::exists(job)) << (words.empty() ? "(none)" : words.back());
  }
  EXPECT_EQ(run(sar::jobs::aux_index_main, {(dir_ / "des").string()}), 2);
  EXPECT_EQ(run(sar::jobs::aux_index_main, {}), 2);
  EXPECT_FALSE(fs::exists(dir_ / "des"));
}

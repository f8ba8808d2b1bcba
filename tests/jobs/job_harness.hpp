#pragma once
// Runs the real focussing executable in a scratch working directory and reads back what it
// left for the host.
#include <gtest/gtest.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <regex>
#include <sstream>
#include <string>
#include <vector>

#include "jobs/setup.hpp"

namespace sar::test {

namespace fs = std::filesystem;

inline const fs::path kReal = SAR_REAL_DATA_DIR;

inline std::string real(const char* folder, const char* name) { return (kReal / folder / name).string(); }
inline const std::string kIm0 =
    real("ASA_IM__0P_truncated", "ASA_IM__0CNPDE20120329_071134_000000163113_00121_52721_6279.N1");
inline const std::string kVor =
    real("DOR_VOR_AX", "DOR_VOR_AXVF-P20080331_075200_20080301_215527_20080303_002327");
inline const std::string kIns =
    real("ASA_INS_AX", "ASA_INS_AXVIEC20110124_114858_20101228_112000_20141231_235959");
inline const std::string kXca =
    real("ASA_XCA_AX", "ASA_XCA_AXVIEC20120607_091724_20120127_000000_20141231_000000");
inline const std::string kCon =
    real("ASA_CON_AX", "ASA_CON_AXVIEC20030703_000000_20020301_000000_20020815_000000");

/// Real auxiliary products the simulator patches into its ASA_INS and ASA_XCA.
inline const std::string kInsTemplate =
    real("ASA_INS_AX", "ASA_INS_AXVIEC20101222_143805_20101022_000000_20141231_235959");
inline const std::string kXcaTemplate =
    real("ASA_XCA_AX", "ASA_XCA_AXVIEC20101111_113830_20100601_000000_20141231_000000");

inline std::string slurp(const fs::path& p) {
  std::ifstream in(p, std::ios::binary);
  std::ostringstream s;
  s << in.rdbuf();
  return s.str();
}

inline std::vector<std::string> lines_of(const fs::path& p) {
  std::vector<std::string> out;
  std::ifstream in(p);
  for (std::string l; std::getline(in, l);) out.push_back(l);
  return out;
}

/// Replaces "Key = value" lines of a parameter file; a key the file lacks is a test failure.
inline void set_parameters(const fs::path& file, const std::vector<std::pair<std::string, std::string>>& values) {
  std::string text = slurp(file);
  for (const auto& [key, value] : values) {
    const std::regex line("(^|\n)" + key + " = [^\n]*");
    ASSERT_TRUE(std::regex_search(text, line)) << key;
    text = std::regex_replace(text, line, "$1" + key + " = " + value);
  }
  std::ofstream(file, std::ios::binary) << text;
}

struct RunResult {
  int status = -1;
  std::string err;
};

class ScratchJob {
 public:
  explicit ScratchJob(const std::string& tag) {
    dir_ = fs::temp_directory_path() / ("sarjob_" + tag + "_" + std::to_string(::getpid()));
    fs::remove_all(dir_);
  }
  ~ScratchJob() {
    std::error_code ec;
    fs::remove_all(dir_, ec);
  }

  /// Lay out the working directory with real inputs for an IM job.
  std::string layout(std::vector<std::string> args = {}, const std::string& mode = "IM",
                     std::vector<std::string> auxDirs = {}) {
    jobs::SetupRequest req;
    req.auxDirs = std::move(auxDirs);
    req.dir = dir_.string();
    req.mode = mode;
    req.dataDir = SAR_DATA_DIR;
    if (args.empty()) args = {kIm0, kVor, kIns, "NotOK"};
    req.arguments = std::move(args);
    return jobs::setup_working_dir(req);
  }

  /// Write a list file with the given lines (a first line that is dropped must be included).
  std::string write_list(const std::string& name, const std::vector<std::string>& lines) const {
    const fs::path p = dir_ / name;
    std::ofstream out(p, std::ios::binary);
    for (const auto& l : lines) out << l << '\n';
    return p.string();
  }

  /// `shellPrefix` runs before the job in the same shell (a resource limit, say).
  RunResult run(const std::string& command, const std::string& envPrefix = "",
                const std::string& shellPrefix = "") const {
    const fs::path errFile = dir_ / "stderr.txt";
    const std::string cmd = "cd '" + dir_.string() + "' && " + shellPrefix + " env VANTERRA_INIT_DIR='" + dir_.string() + "' " +
                            envPrefix + " '" + SAR_FOCUSSING_EXE + "' '" + command + "' >/dev/null 2>'" +
                            errFile.string() + "'";
    const int raw = std::system(cmd.c_str());
    RunResult r;
    r.status = WIFEXITED(raw) ? WEXITSTATUS(raw) : -1;
    r.err = slurp(errFile);
    return r;
  }

  /// The EC written in the error file's third line (" [EC : n]"), or -1.
  int error_code() const {
    const auto lines = lines_of(dir_ / "Vanterra.working_error");
    if (lines.size() < 3) return -1;
    const auto at = lines[2].find("[EC : ");
    return at == std::string::npos ? -1 : std::atoi(lines[2].c_str() + at + 6);
  }
  std::vector<std::string> error_lines() const { return lines_of(dir_ / "Vanterra.working_error"); }
  std::vector<std::string> working_lines() const { return lines_of(dir_ / "Vanterra.working"); }
  std::string log() const { return slurp(dir_ / "Vanterra.log"); }
  const fs::path& dir() const { return dir_; }

 private:
  fs::path dir_;
};

}  // namespace sar::test

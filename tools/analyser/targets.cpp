#include "analyser/targets.hpp"

#include <cctype>
#include <cerrno>
#include <cmath>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <stdexcept>

#include "base/profile.hpp"
#include "base/constants.hpp"

namespace sar::analyser {

namespace {

using sar::base::kSpeedOfLight;

std::vector<std::string> fields_of(std::string_view text) {
  std::vector<std::string> out;
  std::string current;
  for (const char c : text) {
    if (c == ' ' || c == '\t' || c == ',' || c == '\r') {
      if (!current.empty()) out.push_back(std::move(current));
      current.clear();
    } else {
      current += c;
    }
  }
  if (!current.empty()) out.push_back(std::move(current));
  return out;
}

// The value of a key of the truth file, or nothing; the profile cache keeps the file.
bool truth_value(const std::string& path, const std::string& section, const char* key, std::string& value) {
  return base::GetMyProfileString(section, key, value, 4096, path) == base::kProfileOk;
}

}  // namespace

bool parse_number(std::string_view text, double& value) {
  const std::string s(text);
  if (s.empty() || s.size() > 64 || std::isspace(static_cast<unsigned char>(s[0]))) return false;
  char* end = nullptr;
  errno = 0;
  const double v = std::strtod(s.c_str(), &end);
  const bool ok = end == s.c_str() + s.size() && errno != ERANGE && std::isfinite(v);
  errno = 0;
  if (ok) value = v;
  return ok;
}

bool parse_position(std::string_view text, double& line, double& sample) {
  const std::size_t comma = text.find(',');
  if (comma == std::string_view::npos) return false;
  double l = 0.0;
  double s = 0.0;
  if (!parse_number(text.substr(0, comma), l) || !parse_number(text.substr(comma + 1), s)) return false;
  line = l;
  sample = s;
  return true;
}

TruthTargets read_truth_targets(const std::string& path) {
  std::error_code ec;
  if (!std::filesystem::is_regular_file(path, ec)) throw std::runtime_error("no truth file " + path);
  TruthTargets truth;
  // A fresh read: the file may have been written since the cache last saw it.
  base::FreeProfile(path);
  std::string text;
  double fs = 0.0;
  if (truth_value(path, "acquisition", "sampling_frequency", text) && parse_number(text, fs) && fs > 0.0) {
    truth.range_spacing_m = kSpeedOfLight / (2.0 * fs);
  }
  for (int n = 1; n <= 1000000; ++n) {
    const std::string section = "target_" + std::to_string(n);
    std::string line_text;
    std::string sample_text;
    const bool has_line = truth_value(path, section, "azimuth_line", line_text);
    const bool has_sample = truth_value(path, section, "range_sample", sample_text);
    if (!has_line && !has_sample) break;
    ExpectedTarget t;
    t.name = section;
    if (!has_line || !parse_number(line_text, t.line)) {
      base::FreeProfile(path);
      throw std::runtime_error(path + ": [" + section + "] azimuth_line missing or not a number");
    }
    if (!has_sample || !parse_number(sample_text, t.sample)) {
      base::FreeProfile(path);
      throw std::runtime_error(path + ": [" + section + "] range_sample missing or not a number");
    }
    truth.targets.push_back(std::move(t));
  }
  base::FreeProfile(path);
  if (truth.targets.empty()) throw std::runtime_error("no [target_1] section in " + path);
  return truth;
}

std::vector<ExpectedTarget> read_target_list(const std::string& path) {
  std::ifstream in(path);
  if (!in) throw std::runtime_error("cannot read target list " + path);
  std::vector<ExpectedTarget> out;
  std::string text;
  int number = 0;
  while (std::getline(in, text)) {
    ++number;
    if (const std::size_t hash = text.find('#'); hash != std::string::npos) text.erase(hash);
    const std::vector<std::string> f = fields_of(text);
    if (f.empty()) continue;
    ExpectedTarget t;
    if (f.size() > 3 || f.size() < 2 || !parse_number(f[0], t.line) || !parse_number(f[1], t.sample)) {
      throw std::runtime_error(path + ":" + std::to_string(number) + ": expected LINE SAMPLE [NAME]");
    }
    t.name = f.size() == 3 ? f[2] : "target_" + std::to_string(out.size() + 1);
    out.push_back(std::move(t));
  }
  return out;
}

void apply_mapping(std::vector<ExpectedTarget>& targets, const TargetMapping& mapping) {
  for (ExpectedTarget& t : targets) {
    t.line += mapping.line_offset;
    t.sample += mapping.sample_offset;
  }
}

}  // namespace sar::analyser

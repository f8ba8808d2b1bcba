#include "base/arguments.hpp"

#include <filesystem>
#include <fstream>

#include "base/errors.hpp"
#include "base/run_services.hpp"

namespace sar::base {
namespace {

std::string trim_blanks(std::string s) {
  const auto first = s.find_first_not_of(' ');
  if (first == std::string::npos) return {};
  const auto last = s.find_last_not_of(' ');
  return s.substr(first, last - first + 1);
}

std::string bare_name(const std::string& path) {
  const auto cut = path.find_last_of("/\\");
  return cut == std::string::npos ? path : path.substr(cut + 1);
}

}  // namespace

std::string cut_at_host_separator(std::string_view text) {
  const auto pos = text.find(kHostSeparator);
  return std::string(pos == std::string_view::npos ? text : text.substr(0, pos));
}

std::vector<std::string> ReadArgumentList(const std::string& listName, bool trim) {
  std::string name = listName;
  std::ifstream in;
  if (!name.empty() && std::filesystem::is_regular_file(name)) in.open(name, std::ios::binary);
  if (!in.is_open()) {
    TracePrintf("Not found : %s\n", listName.c_str());
    const auto wd = env_lookup("VANTERRA_WORKING_DIR");
    if (!wd) fatal(ec::kConfigMissing, {"VANTERRA_WORKING_DIR"});
    name = *wd + bare_name(listName);
    if (std::filesystem::is_regular_file(name)) in.open(name, std::ios::binary);
    if (!in.is_open()) fatal(ec::kFileNotFound, {listName});
  }
  TracePrintf("aListName : %s\n", name.c_str());

  std::vector<std::string> lines;
  char buffer[kMaxListLine + 1];
  // getline fails on a line that does not fit, which ends the list at that line.
  while (in.getline(buffer, sizeof buffer)) {
    std::string line(buffer);
    if (const auto cr = line.find('\r'); cr != std::string::npos) line.resize(cr);
    if (trim) line = trim_blanks(std::move(line));
    if (!line.empty() && line.front() == '#') break;
    lines.push_back(std::move(line));
  }
  return lines;
}

std::vector<std::string> GetJobArguments(std::string_view listPath) {
  const std::string path = cut_at_host_separator(listPath);
  std::vector<std::string> lines = ReadArgumentList(path, true);
  if (lines.size() < 2) fatal_at(ec::kFileNotFound, {path}, std::string(__FILE__), 5209);
  lines.erase(lines.begin());
  return lines;
}

}  // namespace sar::base

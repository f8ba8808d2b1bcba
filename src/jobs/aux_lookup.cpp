#include "jobs/aux_lookup.hpp"

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <filesystem>
#include <fstream>

#include "base/convert.hpp"
#include "base/diagnostics.hpp"
#include "base/profile.hpp"
#include "envisat/product_types.hpp"

namespace sar::jobs {
namespace fs = std::filesystem;
namespace {

// ENVISAT was launched on 1 March 2002. Products in the ENVISAT format that are valid before
// that (the ERS calibration files carry an ASA_XCA product name) belong to other missions.
constexpr std::string_view kEnvisatLaunch = "01-MAR-2002 00:00:00.000000";

std::string section_name(std::string_view kind, int index) { return std::string(kind) + "_" + std::to_string(index); }

std::string cut27(std::string s) {
  if (s.size() > envisat::kTimeTextLength) s.resize(envisat::kTimeTextLength);
  return s;
}

void trace(const std::string& text) { base::report(base::kReportCheckpoint, text); }

}  // namespace

int find_aux(const std::string& product, const std::string& desDir, std::string_view kind, std::string& result) {
  base::Frame frame("find_aux");
  errno = 0;
  std::string dateText;
  {
    std::ifstream in(product, std::ios::binary);
    if (!in) return errno ? errno : ENOENT;
    in.seekg(static_cast<std::streamoff>(envisat::kMphSensingStartOffset));
    dateText.resize(envisat::kTimeTextLength);
    in.read(dateText.data(), static_cast<std::streamsize>(dateText.size()));
    if (in.gcount() != static_cast<std::streamsize>(dateText.size())) return errno ? errno : EIO;
  }
  const double productDate = base::ascii2sec85(dateText);
  const std::string index = desDir + std::string(kAuxIndexFile);
  char line[1024];
  std::snprintf(line, sizeof line, "Searching %.*s", static_cast<int>(kind.size()), kind.data());
  trace(line);
  std::snprintf(line, sizeof line, "WS0Date : %f", productDate);
  trace(line);
  trace("ASA AUX file : " + index);

  std::string start, stop;
  for (int i = 0;; ++i) {
    const std::string section = section_name(kind, i);
    if (base::GetParString(index, "StartDate", 1, start, 512, section) != base::kProfileOk) {
      base::freeall_ckerr();
      return 10;
    }
    const double startDate = base::ascii2sec85(cut27(start));
    std::snprintf(line, sizeof line, "StartDate : %f", startDate);
    trace(line);
    // An absent stop leaves the start text in the buffer: the period is that one instant.
    stop = start;
    base::GetParString(index, "StopDate", 1, stop, 512, section);
    const double stopDate = base::ascii2sec85(cut27(stop));
    std::snprintf(line, sizeof line, "StopDate : %f", stopDate);
    trace(line);
    if (productDate >= startDate && productDate <= stopDate) {
      std::string name;
      base::GetParString(index, "FileName", 1, name, 512, section);
      result = desDir + name;
      trace("Auxiliary file : " + result);
      if (std::ifstream(result)) trace("Auxiliary file " + result + " found!");
      else base::report(base::kReportError, "Auxiliary File " + result + " not found");
      return 0;
    }
  }
}

std::vector<AuxEntry> scan_aux_products(const std::vector<std::string>& dirs) {
  std::vector<AuxEntry> entries;
  for (const auto& dir : dirs) {
    std::error_code ec;
    for (fs::recursive_directory_iterator it(dir, ec), end; !ec && it != end; it.increment(ec)) {
      if (!it->is_regular_file(ec)) continue;
      const envisat::EnvisatTypes t(it->path().string());
      const int code = t.find_type();
      std::string kind;
      if (code == envisat::kAsaIns) kind = "ASA_INS";
      else if (code == envisat::kAsaXca) kind = "ASA_XCA";
      else if (code == envisat::kAsaXch) kind = "ASA_XCH";
      else continue;
      const auto start = envisat::read_text_at(t.path(), envisat::kMphSensingStartOffset, envisat::kTimeTextLength);
      const auto stop = envisat::read_text_at(t.path(), envisat::kMphSensingStopOffset, envisat::kTimeTextLength);
      if (!start || !stop) continue;
      base::DateParts parts;
      if (base::date2str(*start, parts) != 0 || base::date2str(*stop, parts) != 0) continue;
      if (base::ascii2sec85(*start) < base::ascii2sec85(kEnvisatLaunch)) continue;
      entries.push_back({kind, *start, *stop, t.product_name().value_or(""), fs::absolute(it->path()).string()});
    }
  }
  std::sort(entries.begin(), entries.end(), [](const AuxEntry& a, const AuxEntry& b) {
    return a.kind != b.kind ? a.kind < b.kind : a.name > b.name;
  });
  return entries;
}

void write_aux_index(const std::vector<AuxEntry>& entries, const std::string& desDir) {
  const std::string index = desDir + std::string(kAuxIndexFile);
  base::FreeProfile(index);
  std::error_code ec;
  fs::remove(index, ec);
  int counter[3] = {0, 0, 0};
  for (const auto& e : entries) {
    const int k = e.kind == "ASA_INS" ? 0 : e.kind == "ASA_XCA" ? 1 : 2;
    const std::string section = section_name(e.kind, counter[k]++);
    base::WriteMyProfileString(section, "StartDate", e.start, index);
    base::WriteMyProfileString(section, "StopDate", e.stop, index);
    base::WriteMyProfileString(section, "FileName", fs::relative(e.path, desDir).string(), index);
  }
  base::SyncProfile(index);
  base::FreeProfile(index);
}

std::vector<AuxEntry> read_aux_index(const std::string& desDir) {
  const std::string index = desDir + std::string(kAuxIndexFile);
  std::vector<AuxEntry> entries;
  for (const char* kind : {"ASA_INS", "ASA_XCA", "ASA_XCH"}) {
    for (int i = 0;; ++i) {
      AuxEntry e;
      e.kind = kind;
      const std::string section = section_name(kind, i);
      if (base::GetParString(index, "StartDate", 1, e.start, 512, section) != base::kProfileOk) break;
      base::GetParString(index, "StopDate", 1, e.stop, 512, section);
      std::string name;
      base::GetParString(index, "FileName", 1, name, 512, section);
      e.path = fs::weakly_canonical(fs::path(desDir) / name).string();
      entries.push_back(std::move(e));
    }
  }
  base::FreeProfile(index);
  return entries;
}

}  // namespace sar::jobs

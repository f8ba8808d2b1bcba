#include "jobs/discovery.hpp"

#include <algorithm>
#include <filesystem>

#include "base/convert.hpp"
#include "envisat/product_types.hpp"

namespace sar::jobs {
namespace fs = std::filesystem;

namespace {
constexpr const char* kOrbitFamilies[] = {"DOR_VOR", "DOR_POR", "AUX_FPO", "AUX_FRO"};

std::string time_text(double sec85) {
  std::string text;
  if (base::sec852myascii(sec85, text) != 0) return "(invalid time)";
  return text;
}

std::optional<double> time_at(const std::string& path, std::size_t offset) {
  const auto text = envisat::read_text_at(path, offset, envisat::kTimeTextLength);
  if (!text) return std::nullopt;
  base::DateParts parts;
  if (base::date2str(*text, parts) != 0) return std::nullopt;
  return base::ascii2sec85(*text);
}
}  // namespace

std::optional<double> product_sensing_start(const std::string& product) {
  return time_at(product, envisat::kMphSensingStartOffset);
}

std::vector<OrbitCandidate> scan_orbit_products(const std::string& dir) {
  std::vector<OrbitCandidate> out;
  std::error_code ec;
  for (fs::recursive_directory_iterator it(dir, ec), end; !ec && it != end; it.increment(ec)) {
    if (!it->is_regular_file(ec)) continue;
    const std::string path = it->path().string();
    const auto name = envisat::EnvisatTypes(path).product_name();
    if (!name) continue;
    for (int f = 0; f < 4; ++f) {
      if (name->rfind(kOrbitFamilies[f], 0) != 0) continue;
      const auto start = time_at(path, envisat::kMphSensingStartOffset);
      const auto stop = time_at(path, envisat::kMphSensingStopOffset);
      if (start && stop) out.push_back({path, *name, f, *start, *stop});
    }
  }
  return out;
}

std::optional<OrbitCandidate> choose_orbit(const std::vector<OrbitCandidate>& candidates, double sensingStart) {
  std::optional<OrbitCandidate> best;
  for (const auto& c : candidates) {
    if (!(c.start < sensingStart && sensingStart < c.stop)) continue;
    if (!best || c.preference < best->preference || (c.preference == best->preference && c.name > best->name))
      best = c;
  }
  return best;
}

std::optional<OrbitCandidate> pick_orbit(const std::vector<OrbitCandidate>& candidates, double sensingStart,
                                         const std::string& where, std::string& error) {
  auto chosen = choose_orbit(candidates, sensingStart);
  if (chosen) return chosen;
  error = "no orbit file in " + where + " covers the product's sensing start " + time_text(sensingStart);
  if (candidates.empty()) {
    error += " (the folder holds no DOR_VOR, DOR_POR, AUX_FPO or AUX_FRO product)";
    return std::nullopt;
  }
  // The neighbours of the date help to tell a gap in an archive from the wrong archive.
  const OrbitCandidate* before = nullptr;
  const OrbitCandidate* after = nullptr;
  for (const auto& c : candidates) {
    if (c.stop <= sensingStart && (!before || c.stop > before->stop)) before = &c;
    if (c.start >= sensingStart && (!after || c.start < after->start)) after = &c;
  }
  std::string hint;
  if (before) hint += "the last validity before it ends " + time_text(before->stop) + " (" + before->name + ")";
  if (after)
    hint += std::string(hint.empty() ? "" : ", ") + "the next starts " + time_text(after->start) + " (" + after->name + ")";
  if (!hint.empty()) error += ": " + hint;
  return std::nullopt;
}

std::optional<OrbitCandidate> find_orbit_for(const std::string& product, const std::string& dir, std::string& error) {
  const auto start = product_sensing_start(product);
  if (!start) {
    error = "cannot read the sensing start of " + product;
    return std::nullopt;
  }
  return pick_orbit(scan_orbit_products(dir), *start, dir, error);
}

}  // namespace sar::jobs

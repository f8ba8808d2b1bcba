#include "jobs/discovery.hpp"

#include <algorithm>
#include <filesystem>

#include "base/convert.hpp"
#include "envisat/product_types.hpp"

namespace sar::jobs {
namespace fs = std::filesystem;

namespace {
constexpr const char* kOrbitFamilies[] = {"DOR_VOR", "DOR_POR", "AUX_FPO", "AUX_FRO"};

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

}  // namespace sar::jobs

// Elevation antenna correction of a sub-swath: every range column is divided by the two-way
// elevation pattern at the look angle under which the antenna saw it, so that a uniform scene
// comes out level across the sub-swath.
#include <cmath>
#include <span>

#include "base/diagnostics.hpp"
#include "scansar/wide_swath.hpp"

namespace sar::scansar {
namespace {
constexpr double kFineStep = 0.0008726646259971648;    // rad, 0.05 degrees
constexpr double kCoarseStep = 0.001256637061435917;   // rad, 0.072 degrees
}  // namespace

double ElevationPattern::step() const { return reference >= 0.0 ? kFineStep : kCoarseStep; }

int envi_beam_corr(const ElevationPattern& pattern, const std::array<double, 5>& slantToElevation, double x0, double fs,
                   std::span<float> gain) {
  const auto& a = pattern.amplitude;
  const int n = static_cast<int>(a.size());
  int outside = 0;
  for (std::size_t j = 0; j < gain.size(); ++j) {
    const double x = x0 + static_cast<double>(j) / fs;
    const double theta = poly4(slantToElevation, x);
    const double g = (theta - pattern.reference) / pattern.step() + (n == 0 ? 0 : (n - 1) / 2);
    const double k = std::floor(g);
    if (n < 2 || !(k >= 0.0) || k > n - 2) {
      gain[j] = 1.0f;
      ++outside;
      continue;
    }
    const auto i = static_cast<std::size_t>(k);
    const double p = a[i] + (g - k) * (a[i + 1] - a[i]);
    gain[j] = p > 0.0 ? static_cast<float>(1.0 / p) : 1.0f;
  }
  if (outside > 0 && n >= 2) base::report(base::kReportWarning, "\n ERROR: out of antenna beam range \n");
  return outside;
}

}  // namespace sar::scansar

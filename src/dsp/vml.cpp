#include "dsp/vml.hpp"

#include <cmath>
#include <cstdio>
#include <stdexcept>

namespace sar::dsp {
namespace {
void check(const char* what, int n, std::size_t a, std::size_t b, std::size_t c) {
  if (n < 0 || static_cast<std::size_t>(n) > a || static_cast<std::size_t>(n) > b || static_cast<std::size_t>(n) > c) {
    char msg[160];
    std::snprintf(msg, sizeof msg, "%s: count %d against spans of %zu, %zu and %zu", what, n, a, b, c);
    throw std::invalid_argument(msg);
  }
}
}  // namespace

void vsSinCos(int n, std::span<const float> angles, std::span<float> sines, std::span<float> cosines) {
  check("vsSinCos", n, angles.size(), sines.size(), cosines.size());
  for (int i = 0; i < n; ++i) {
    const double a = angles[static_cast<std::size_t>(i)];
    sines[static_cast<std::size_t>(i)] = static_cast<float>(std::sin(a));
    cosines[static_cast<std::size_t>(i)] = static_cast<float>(std::cos(a));
  }
}

void vsPowx(int n, std::span<const float> values, float exponent, std::span<float> results) {
  check("vsPowx", n, values.size(), results.size(), results.size());
  if (exponent == 2.0f) {
    for (int i = 0; i < n; ++i) {
      const float v = values[static_cast<std::size_t>(i)];
      results[static_cast<std::size_t>(i)] = v * v;
    }
    return;
  }
  for (int i = 0; i < n; ++i)
    results[static_cast<std::size_t>(i)] = std::pow(values[static_cast<std::size_t>(i)], exponent);
}

}  // namespace sar::dsp

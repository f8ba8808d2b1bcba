#include <gtest/gtest.h>

#include <cmath>
#include <stdexcept>
#include <vector>

#include "dsp/vml.hpp"

namespace sar::dsp {
namespace {

TEST(Vml, SinCosAndPowx) {
  const std::vector<float> angles = {0.0f, 1.0f, -2.5f, 1000.0f};
  std::vector<float> s(4), c(4);
  vsSinCos(4, angles, s, c);
  for (std::size_t i = 0; i < angles.size(); ++i) {
    EXPECT_NEAR(s[i], std::sin(static_cast<double>(angles[i])), 1e-7);
    EXPECT_NEAR(c[i], std::cos(static_cast<double>(angles[i])), 1e-7);
  }
  std::vector<float> v = {-3.0f, 0.5f, 2.0f}, r(3);
  vsPowx(3, v, 2.0f, r);
  EXPECT_EQ(r, (std::vector<float>{9.0f, 0.25f, 4.0f}));
  vsPowx(2, std::span<const float>(v).subspan(1), 0.5f, r);
  EXPECT_FLOAT_EQ(r[0], std::sqrt(0.5f));
  EXPECT_FLOAT_EQ(r[1], std::sqrt(2.0f));
  // Only the first n elements are touched.
  EXPECT_EQ(r[2], 4.0f);
  EXPECT_THROW(vsSinCos(-1, angles, s, c), std::invalid_argument);
  EXPECT_THROW(vsPowx(4, v, 2.0f, r), std::invalid_argument);
}

}  // namespace
}  // namespace sar::dsp

// 8:4 block adaptive quantisation written by the simulator.
#include <gtest/gtest.h>

#include <cmath>
#include <random>
#include <vector>

#include "simulator/fbaq_encoder.hpp"

namespace sim = sar::simulator;

TEST(FbaqEncoder, LineLengthsFollowTheBlockLayout) {
  struct Case {
    int samples;
    std::size_t bytes;
  };
  const Case cases[] = {
      {63, 64},         // one whole block, no short block
      {126, 128},       // two whole blocks
      {64, 64 + 2},     // r = 1: short block of 2 bytes, even, no pad
      {65, 64 + 4},     // r = 2: 3 bytes, one pad byte
      {125, 64 + 64},   // r = 62: 63 bytes and a pad
      {1024, 1042},     // 16 blocks, r = 16: 17 bytes and a pad
      {5616, 5706},
      {6656, 6762},     // the real IS6 packet: L - 29 = 6762
  };
  for (const Case& c : cases) EXPECT_EQ(sim::fbaq_line_bytes(c.samples), c.bytes) << c.samples;
}

TEST(FbaqEncoder, CodesAreSignAndMagnitude) {
  const sim::FbaqTable& t = sim::simulator_fbaq_table();
  for (int code = 0; code < 16; ++code) {
    EXPECT_EQ(sim::fbaq_row_to_code(sim::fbaq_code_to_row(code)), code);
    const float v = t.value[static_cast<std::size_t>(sim::fbaq_code_to_row(code))][100];
    EXPECT_EQ(v > 0.0f, code < 8) << code;
  }
  // Code 0 is the smallest positive level, code 15 the largest negative one.
  EXPECT_LT(t.value[static_cast<std::size_t>(sim::fbaq_code_to_row(0))][100], t.value[static_cast<std::size_t>(sim::fbaq_code_to_row(1))][100]);
  EXPECT_EQ(sim::fbaq_code_to_row(15), 0);
  EXPECT_EQ(sim::fbaq_code_to_row(8), 7);
}

TEST(FbaqEncoder, NibblesAndThresholdsLandWhereTheFormatPutsThem) {
  // A constant line: every sample must reconstruct from (threshold, I nibble, Q nibble) read
  // straight off the bytes.
  std::vector<float> iq;
  for (int k = 0; k < 70; ++k) iq.insert(iq.end(), {10.5f, -3.5f});
  std::vector<uint8_t> bytes;
  sim::fbaq_encode_line(iq, sim::simulator_fbaq_table(), bytes);
  ASSERT_EQ(bytes.size(), sim::fbaq_line_bytes(70));
  const sim::FbaqTable& t = sim::simulator_fbaq_table();
  for (std::size_t block : {0u, 64u}) {
    const std::size_t c = bytes[block];
    const uint8_t sample = bytes[block + 1];
    EXPECT_NEAR(t.value[static_cast<std::size_t>(sim::fbaq_code_to_row(sample >> 4))][c], 10.5f, 1.5f);
    EXPECT_NEAR(t.value[static_cast<std::size_t>(sim::fbaq_code_to_row(sample & 15))][c], -3.5f, 1.5f);
    EXPECT_LT(sample >> 4, 8);    // I positive
    EXPECT_GE(sample & 15, 8);    // Q negative
  }
}

TEST(FbaqEncoder, GaussianLinesRoundTripAbove18dB) {
  std::mt19937 random(7);
  for (const double sigma : {2.0, 8.0, 30.0}) {
    std::normal_distribution<double> normal(0.0, sigma);
    std::vector<float> iq(2 * 5616);
    for (float& v : iq) v = static_cast<float>(std::clamp(std::floor(normal(random)) + 0.5, -127.5, 127.5));
    std::vector<uint8_t> bytes;
    sim::fbaq_encode_line(iq, sim::simulator_fbaq_table(), bytes);
    const std::vector<float> back = sim::fbaq_decode_line(bytes, 5616, sim::simulator_fbaq_table());
    double signal = 0.0, error = 0.0;
    for (std::size_t i = 0; i < iq.size(); ++i) {
      signal += static_cast<double>(iq[i]) * iq[i];
      error += (static_cast<double>(iq[i]) - back[i]) * (static_cast<double>(iq[i]) - back[i]);
    }
    EXPECT_GT(10.0 * std::log10(signal / error), 18.0) << "sigma " << sigma;
  }
}

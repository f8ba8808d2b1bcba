#include <gtest/gtest.h>

#include <algorithm>
#include <cmath>
#include <cstdint>
#include <filesystem>
#include <random>
#include <vector>

#include "envisat/aux_products.hpp"
#include "envisat/fbaq.hpp"

using namespace sar::envisat;

namespace {

const std::string kIns = (std::filesystem::path(SAR_REAL_DATA_DIR) /
                          "ASA_INS_AX/ASA_INS_AXVIEC20101222_143805_20101022_000000_20141231_235959")
                             .string();

// Tables whose value tells where it was read: I = 1000 row + column, Q the negative.
FbaqTables tagged_tables() {
  FbaqTables t;
  for (int r = 0; r < 16; ++r)
    for (int c = 0; c < 256; ++c) {
      t.i.values[static_cast<std::size_t>(r * 256 + c)] = static_cast<float>(1000 * r + c);
      t.q.values[static_cast<std::size_t>(r * 256 + c)] = -static_cast<float>(1000 * r + c);
    }
  return t;
}

// Table row of a 4-bit code, written from the code's meaning: 0-7 are the positive levels in
// rising order, the upper half of the rows; 8-15 the negative ones rising in size downwards.
int row_of(int code) { return code < 8 ? 8 + code : 15 - code; }

// Test-side encoder of one line, from the format: per block a threshold byte, then per sample
// the sign-magnitude code of the nearest level of that column, I high nibble, Q low nibble;
// a short block is padded to an even length.
std::vector<std::uint8_t> encode_line(const FbaqTables& t, const std::vector<float>& iq, int threshold) {
  const std::size_t n = iq.size() / 2;
  auto code_of = [&](const FbaqLut& lut, float v) {
    int best = 0;
    for (int code = 1; code < 16; ++code)
      if (std::fabs(lut(row_of(code), threshold) - v) < std::fabs(lut(row_of(best), threshold) - v)) best = code;
    return best;
  };
  std::vector<std::uint8_t> bytes;
  for (std::size_t s = 0; s < n; ++s) {
    if (s % 63 == 0) bytes.push_back(static_cast<std::uint8_t>(threshold));
    bytes.push_back(static_cast<std::uint8_t>((code_of(t.i, iq[2 * s]) << 4) | code_of(t.q, iq[2 * s + 1])));
  }
  if (bytes.size() % 2) bytes.push_back(0xff);  // padding carries no sample
  return bytes;
}

}  // namespace

TEST(Fbaq, EchoLineLayout) {
  struct Case {
    std::int64_t n, blocks, r, pad, bytes;
  };
  const Case cases[] = {
      {126, 2, 0, 0, 128},   // a multiple of 63: no short block
      {65, 1, 2, 1, 68},     // r even: r + 1 odd, one padding byte
      {64, 1, 1, 0, 66},     // r odd: no padding
      {125, 1, 62, 1, 128},  // r = 62: the short block is as long as a whole one
      {1, 0, 1, 0, 2},
      {5616, 89, 9, 0, 5706},
      {0, 0, 0, 0, 0},
  };
  for (const Case& c : cases) {
    const EchoLineLayout l = echo_line_layout(c.n);
    EXPECT_EQ(l.wholeBlocks, c.blocks) << c.n;
    EXPECT_EQ(l.remainder, c.r) << c.n;
    EXPECT_EQ(l.pad, c.pad) << c.n;
    EXPECT_EQ(l.lineBytes, c.bytes) << c.n;
  }
  EXPECT_TRUE(packet_fits_echo(65, 136));
  EXPECT_FALSE(packet_fits_echo(65, 135));
  EXPECT_FALSE(packet_fits_echo(0, 0));
  EXPECT_TRUE(packet_fits_noise(5, 12));
  EXPECT_FALSE(packet_fits_noise(5, 10));
  EXPECT_FALSE(packet_fits_noise(-1, 0));
}

TEST(Fbaq, EveryCodeReadsItsRowAndTheBlockThreshold) {
  const FbaqTables t = tagged_tables();
  // Two whole blocks with thresholds 7 and 255; sample byte s of block 0 is s - 1, so that all
  // 16 x 16 nibble pairs appear across both blocks.
  std::vector<std::uint8_t> payload(128);
  payload[0] = 7;
  payload[64] = 255;
  for (int s = 1; s < 64; ++s) {
    payload[static_cast<std::size_t>(s)] = static_cast<std::uint8_t>(s - 1);
    payload[static_cast<std::size_t>(64 + s)] = static_cast<std::uint8_t>(s + 62);
  }
  std::vector<float> out(2 * 126);
  int floats = 0, lines = 0;
  ASSERT_EQ(fbaq_decode84_f(t, payload, out, 126, 1, floats, lines), 0);
  EXPECT_EQ(floats, 252);
  EXPECT_EQ(lines, 1);
  for (int s = 0; s < 126; ++s) {
    const int v = payload[static_cast<std::size_t>(s < 63 ? s + 1 : s + 2)];
    const int threshold = s < 63 ? 7 : 255;
    EXPECT_EQ(out[static_cast<std::size_t>(2 * s)], 1000 * row_of(v >> 4) + threshold) << s;
    EXPECT_EQ(out[static_cast<std::size_t>(2 * s + 1)], -(1000 * row_of(v & 15) + threshold)) << s;
  }
}

TEST(Fbaq, NoiseUsesTheFixedTable) {
  // Code 0: smallest positive level, 7 the largest; 8 the smallest negative, 15 the largest.
  const std::vector<std::uint8_t> payload = {0x07, 0x8f, 0x3c, 0x00, 0x07, 0x8f, 0x3c, 0x00};
  std::vector<float> out(6, 99.0f);
  int floats = 0, lines = 0;
  ASSERT_EQ(fbaq_decode84fe(payload, out, 3, 1, floats, lines), 0);
  EXPECT_EQ(lines, 2);   // two lines of 3 samples padded to 4 bytes
  EXPECT_EQ(floats, 6);  // of which only the first is decoded
  const std::vector<float> expected = {0.004f, 0.05906f, -0.004f, -0.05906f, 0.0275f, -0.035f};
  for (std::size_t k = 0; k < expected.size(); ++k) EXPECT_FLOAT_EQ(out[k], expected[k]) << k;
  EXPECT_EQ(fbaq_decode84fe(std::vector<std::uint8_t>(7), out, 3, 1, floats, lines), 1);
}

TEST(Fbaq, MismatchedPayloadsAreRefusedUntouched) {
  const FbaqTables t = tagged_tables();
  std::vector<float> out(400, 7.0f);
  int floats = -1, lines = -1;
  EXPECT_EQ(fbaq_decode84_f(t, std::vector<std::uint8_t>(67), out, 65, 1, floats, lines), 1);
  EXPECT_EQ(fbaq_decode84_f(t, std::vector<std::uint8_t>(10), out, 0, 1, floats, lines), 1);
  EXPECT_EQ(floats, -1);
  EXPECT_TRUE(std::all_of(out.begin(), out.end(), [](float v) { return v == 7.0f; }));
  // A divisor halves the window, rounding up: 129 samples / 2 = 65, one line of 68 bytes.
  EXPECT_EQ(fbaq_decode84_f(t, std::vector<std::uint8_t>(68), out, 129, 2, floats, lines), 0);
  EXPECT_EQ(floats, 130);
  // Output too small for what the payload holds: a broken contract, not a write past the end.
  std::vector<float> small(10);
  EXPECT_THROW(fbaq_decode84_f(t, std::vector<std::uint8_t>(68), small, 65, 1, floats, lines),
               std::invalid_argument);
}

// Round trip with the real tables: samples drawn inside a column's range come back within half
// the widest gap between neighbouring levels of that column.
TEST(Fbaq, BlockRoundTripWithRealTablesStaysWithinTheQuantiserStep) {
  FbaqTables t;
  ASSERT_EQ(LUTfbaq_f(kIns, t.q, t.i), 0);
  std::mt19937 rng(12345);
  for (const int n : {63, 64, 65, 125, 126, 300}) {
    for (const int threshold : {40, 128, 255}) {
      auto half_step = [&](const FbaqLut& lut) {
        float step = 0.0f;
        for (int r = 0; r < 15; ++r) step = std::max(step, lut(r + 1, threshold) - lut(r, threshold));
        return step / 2;
      };
      const float lo = std::max(t.i(0, threshold), t.q(0, threshold));
      const float hi = std::min(t.i(15, threshold), t.q(15, threshold));
      ASSERT_LT(lo, hi);
      std::uniform_real_distribution<float> u(lo, hi);
      // Two lines in one payload.
      std::vector<float> iq(static_cast<std::size_t>(4 * n));
      for (float& v : iq) v = u(rng);
      std::vector<std::uint8_t> payload =
          encode_line(t, std::vector<float>(iq.begin(), iq.begin() + 2 * n), threshold);
      const auto second = encode_line(t, std::vector<float>(iq.begin() + 2 * n, iq.end()), threshold);
      payload.insert(payload.end(), second.begin(), second.end());
      std::vector<float> out(iq.size());
      int floats = 0, lines = 0;
      ASSERT_EQ(fbaq_decode84_f(t, payload, out, n, 1, floats, lines), 0) << n;
      EXPECT_EQ(lines, 2);
      EXPECT_EQ(floats, 4 * n);
      const float tolI = half_step(t.i) * 1.0001f, tolQ = half_step(t.q) * 1.0001f;
      for (std::size_t k = 0; k < iq.size(); k += 2) {
        ASSERT_NEAR(out[k], iq[k], tolI) << "n " << n << " threshold " << threshold << " sample " << k / 2;
        ASSERT_NEAR(out[k + 1], iq[k + 1], tolQ) << "n " << n << " threshold " << threshold << " sample " << k / 2;
      }
    }
  }
}

TEST(Fbaq, GainTableFollowsTheInstrumentModel) {
  // Gain model of this product, from the bytes at record 171368 (T = 0x40a00000 = 5) and
  // 171372 (c0..c7 = -0.004739, 0.403, 25, -0.004232, 0.4697, 175, 0.0006683, -0.06206).
  const double T = 5.0;
  const double a = -0.004739 * T + 0.403, b = -0.004232 * T + 0.4697, d = 0.0006683 * T - 0.06206;
  const double fs = 19207680.0;
  std::vector<float> g(kGainTableLength);
  ASSERT_EQ(read_gain_table(kIns, g), 0);
  for (const int k : {0, 1, 100, 1000, 5000, 8191}) {
    const double x = k * 1e6 / fs;
    const double expected = std::pow(10.0, 0.05 * (a * std::exp(-x / 25.0) + b * std::exp(-x / 175.0) + d));
    EXPECT_NEAR(g[static_cast<std::size_t>(k)], expected, 1e-5) << k;  // float rounding of the terms
  }
  // The gain sags over the window towards the constant term.
  EXPECT_TRUE(std::is_sorted(g.rbegin(), g.rend()));
  EXPECT_GT(g.front(), 1.09f);
}

#include "simulator/fbaq_encoder.hpp"

#include <algorithm>
#include <cmath>
#include <stdexcept>

namespace sar::simulator {

namespace {

// Lloyd-Max reconstruction levels of a 16-level quantiser for a unit Gaussian (positive half).
constexpr double kLloydMax16[8] = {0.1284, 0.3881, 0.6568, 0.9424, 1.2562, 1.6181, 2.0690, 2.7326};

FbaqTable make_table() {
  FbaqTable t;
  for (int c = 0; c < kFbaqColumns; ++c) {
    const double s = fbaq_column_sigma(c);
    for (int k = 0; k < 8; ++k) {
      t.value[static_cast<std::size_t>(8 + k)][static_cast<std::size_t>(c)] = static_cast<float>(kLloydMax16[k] * s);
      t.value[static_cast<std::size_t>(7 - k)][static_cast<std::size_t>(c)] = static_cast<float>(-kLloydMax16[k] * s);
    }
  }
  return t;
}

// Row of the level nearest to x in column c (levels rise with the row).
int nearest_row(const FbaqTable& t, int c, float x) {
  int lo = 0, hi = kFbaqLevels - 1;
  while (hi - lo > 1) {  // last row whose level is <= x, by bisection
    const int mid = (lo + hi) / 2;
    if (t.value[static_cast<std::size_t>(mid)][static_cast<std::size_t>(c)] <= x) lo = mid; else hi = mid;
  }
  const float dl = std::abs(x - t.value[static_cast<std::size_t>(lo)][static_cast<std::size_t>(c)]);
  const float dh = std::abs(x - t.value[static_cast<std::size_t>(hi)][static_cast<std::size_t>(c)]);
  return dl <= dh ? lo : hi;
}

double block_error(const FbaqTable& t, int c, std::span<const float> values) {
  double e = 0.0;
  for (float x : values) {
    const double d = x - t.value[static_cast<std::size_t>(nearest_row(t, c, x))][static_cast<std::size_t>(c)];
    e += d * d;
  }
  return e;
}

int best_column(const FbaqTable& t, std::span<const float> values) {
  double power = 0.0;
  for (float x : values) power += static_cast<double>(x) * x;
  const double sigma = values.empty() ? 0.0 : std::sqrt(power / static_cast<double>(values.size()));
  const int guess = std::clamp(static_cast<int>(std::lround(sigma / 0.25 - 1.0)), 0, kFbaqColumns - 1);
  int best = guess;
  double best_error = block_error(t, guess, values);
  // The optimum for a non-Gaussian block (a bright target) can sit a little off the sigma column.
  for (int c = std::max(0, guess - 6); c <= std::min(kFbaqColumns - 1, guess + 6); ++c) {
    const double e = block_error(t, c, values);
    if (e < best_error) {
      best_error = e;
      best = c;
    }
  }
  return best;
}

void encode_block(std::span<const float> iq, const FbaqTable& t, std::vector<uint8_t>& out) {
  const int c = best_column(t, iq);
  out.push_back(static_cast<uint8_t>(c));
  for (std::size_t k = 0; k + 1 < iq.size(); k += 2) {
    const int ci = fbaq_row_to_code(nearest_row(t, c, iq[k]));
    const int cq = fbaq_row_to_code(nearest_row(t, c, iq[k + 1]));
    out.push_back(static_cast<uint8_t>((ci << 4) | cq));
  }
}

}  // namespace

double fbaq_column_sigma(int t) { return 0.25 * (t + 1); }

const FbaqTable& simulator_fbaq_table() {
  static const FbaqTable table = make_table();
  return table;
}

int fbaq_code_to_row(int code) { return code < 8 ? code + 8 : 15 - code; }
int fbaq_row_to_code(int row) { return row >= 8 ? row - 8 : 15 - row; }

std::size_t fbaq_line_bytes(int samples) {
  if (samples <= 0) throw std::invalid_argument("line without samples");
  const std::size_t n = static_cast<std::size_t>(samples);
  const std::size_t blocks = n / kFbaqBlockSamples, rest = n % kFbaqBlockSamples;
  return 64 * blocks + (rest == 0 ? 0 : 2 * ((rest + 2) / 2));
}

void fbaq_encode_line(std::span<const float> iq, const FbaqTable& table, std::vector<uint8_t>& out) {
  const std::size_t n = iq.size() / 2;
  const std::size_t start = out.size();
  for (std::size_t s = 0; s < n; s += kFbaqBlockSamples) {
    const std::size_t count = std::min<std::size_t>(kFbaqBlockSamples, n - s);
    encode_block(iq.subspan(2 * s, 2 * count), table, out);
  }
  // A short block of r samples is r + 1 bytes; an odd length gets one padding byte.
  if ((out.size() - start) % 2 != 0) out.push_back(0);
  if (out.size() - start != fbaq_line_bytes(static_cast<int>(n))) throw std::logic_error("FBAQ line length");
}

std::vector<float> fbaq_decode_line(std::span<const uint8_t> bytes, int samples, const FbaqTable& table) {
  if (samples <= 0 || bytes.size() < fbaq_line_bytes(samples)) throw std::invalid_argument("short FBAQ line");
  std::vector<float> iq;
  iq.reserve(2 * static_cast<std::size_t>(samples));
  std::size_t pos = 0;
  for (int s = 0; s < samples; s += kFbaqBlockSamples) {
    const std::size_t c = bytes[pos++];
    const int count = std::min(kFbaqBlockSamples, samples - s);
    for (int k = 0; k < count; ++k, ++pos) {
      iq.push_back(table.value[static_cast<std::size_t>(fbaq_code_to_row(bytes[pos] >> 4))][c]);
      iq.push_back(table.value[static_cast<std::size_t>(fbaq_code_to_row(bytes[pos] & 15))][c]);
    }
  }
  return iq;
}

namespace {
// The fixed table of the noise levels in rising order (rows); code c names row 8 + c for c < 8
// and row 15 - c otherwise, as for echoes.
constexpr double kNoiseLevels[16] = {-0.05906, -0.051, -0.043, -0.035, -0.0275, -0.02, -0.012, -0.004,
                                     0.004,    0.012,  0.02,   0.0275, 0.035,   0.043, 0.051,  0.05906};

// Code of the 4-bit ADC level nearest to x counts: magnitude floor(|x|), at most 7, with the sign.
int noise_code(double x) {
  const int magnitude = std::min(7, static_cast<int>(std::floor(std::abs(x))));
  return x >= 0.0 ? magnitude : 8 + magnitude;
}
}  // namespace

double noise_level(int code) { return kNoiseLevels[fbaq_code_to_row(code & 15)]; }

std::size_t noise_line_bytes(int samples) {
  if (samples <= 0) throw std::invalid_argument("line without samples");
  return static_cast<std::size_t>(samples + samples % 2);
}

double noise_encode_line(std::span<const double> iq, std::vector<uint8_t>& out) {
  const std::size_t n = iq.size() / 2;
  double power = 0.0;
  for (std::size_t k = 0; k < n; ++k) {
    const int ci = noise_code(iq[2 * k]), cq = noise_code(iq[2 * k + 1]);
    power += noise_level(ci) * noise_level(ci) + noise_level(cq) * noise_level(cq);
    out.push_back(static_cast<uint8_t>((ci << 4) | cq));
  }
  if (n % 2 != 0) out.push_back(0);
  return n == 0 ? 0.0 : power / static_cast<double>(n);
}

}  // namespace sar::simulator

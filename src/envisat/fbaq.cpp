#include "envisat/fbaq.hpp"

#include <cmath>
#include <cstddef>
#include <stdexcept>

#include "base/diagnostics.hpp"

namespace sar::envisat {
namespace {

constexpr const char* kMismatch = " window length and packet size do not match!";

int divided(int samples, int divisor) {
  if (divisor < 1) throw std::invalid_argument("FBAQ divisor below 1");
  return samples <= 0 ? samples : (samples + divisor - 1) / divisor;
}

void need(std::span<float> out, std::int64_t floats) {
  if (floats < 0 || static_cast<std::uint64_t>(floats) > out.size())
    throw std::invalid_argument("FBAQ output of " + std::to_string(out.size()) + " floats, " +
                                std::to_string(floats) + " needed");
}

}  // namespace

EchoLineLayout echo_line_layout(std::int64_t samples) {
  EchoLineLayout l;
  if (samples <= 0) return l;
  l.wholeBlocks = samples / kFbaqBlockSamples;
  l.remainder = samples - kFbaqBlockSamples * l.wholeBlocks;
  const std::int64_t shortBytes = l.remainder == 0 ? 0 : 2 * ((l.remainder + 2) / 2);
  l.pad = l.remainder == 0 ? 0 : shortBytes - (l.remainder + 1);
  l.lineBytes = kFbaqBlockBytes * l.wholeBlocks + shortBytes;
  return l;
}

std::int64_t noise_line_bytes(std::int64_t samples) { return samples <= 0 ? 0 : samples + (samples & 1); }

bool packet_fits_echo(std::int64_t samples, std::int64_t payloadBytes) {
  const std::int64_t line = echo_line_layout(samples).lineBytes;
  return line > 0 && payloadBytes >= 0 && payloadBytes % line == 0;
}

bool packet_fits_noise(std::int64_t samples, std::int64_t payloadBytes) {
  const std::int64_t line = noise_line_bytes(samples);
  return line > 0 && payloadBytes >= 0 && payloadBytes % line == 0;
}

int fbaq_decode84_f(const FbaqTables& tables, std::span<const std::uint8_t> payload, std::span<float> out,
                    int samples, int divisor, int& floatCount, int& lineCount, bool reportMismatch) {
  const int n = divided(samples, divisor);
  const auto size = static_cast<std::int64_t>(payload.size());
  if (!packet_fits_echo(n, size)) {
    if (reportMismatch) sar::base::report(sar::base::kReportError, kMismatch);
    return 1;
  }
  const EchoLineLayout l = echo_line_layout(n);
  const std::int64_t lines = size / l.lineBytes;
  need(out, 2 * n * lines);

  // Decodes `count` sample bytes after the threshold byte at `block`.
  float* o = out.data();
  auto decode_block = [&](const std::uint8_t* block, std::int64_t count) {
    const int t = block[0];
    for (std::int64_t s = 1; s <= count; ++s) {
      const int v = block[s];
      *o++ = tables.i(kFbaqCodeMap[static_cast<std::size_t>(v >> 4)], t);
      *o++ = tables.q(kFbaqCodeMap[static_cast<std::size_t>(v & 15)], t);
    }
  };
  const std::uint8_t* p = payload.data();
  for (std::int64_t line = 0; line < lines; ++line) {
    for (std::int64_t b = 0; b < l.wholeBlocks; ++b, p += kFbaqBlockBytes) decode_block(p, kFbaqBlockSamples);
    // The padding byte of a short block carries no sample and is not decoded, so lines follow
    // each other with no gap in the output.
    if (l.remainder > 0) {
      decode_block(p, l.remainder);
      p += l.remainder + 1 + l.pad;
    }
  }
  floatCount = static_cast<int>(2 * n * lines);
  lineCount = static_cast<int>(lines);
  return 0;
}

int fbaq_decode84fe(std::span<const std::uint8_t> payload, std::span<float> out, int samples, int divisor,
                    int& floatCount, int& lineCount, bool reportMismatch) {
  const int n = divided(samples, divisor);
  const auto size = static_cast<std::int64_t>(payload.size());
  if (!packet_fits_noise(n, size)) {
    if (reportMismatch) sar::base::report(sar::base::kReportWarning, kMismatch);
    return 1;
  }
  lineCount = static_cast<int>(size / noise_line_bytes(n));
  // An empty payload holds no line to decode.
  const std::int64_t decoded = lineCount > 0 ? n : 0;
  need(out, 2 * decoded);
  for (std::int64_t k = 0; k < decoded; ++k) {
    const int v = payload[static_cast<std::size_t>(k)];
    out[static_cast<std::size_t>(2 * k)] = static_cast<float>(kFbaqNoiseTable[static_cast<std::size_t>(kFbaqCodeMap[static_cast<std::size_t>(v >> 4)])]);
    out[static_cast<std::size_t>(2 * k + 1)] = static_cast<float>(kFbaqNoiseTable[static_cast<std::size_t>(kFbaqCodeMap[static_cast<std::size_t>(v & 15)])]);
  }
  floatCount = static_cast<int>(2 * decoded);
  return 0;
}

void gain_table(const InsRecord& ins, std::span<float> table) {
  const float fs = ins.sampling_frequency();
  const float t = ins.gain_temperature();
  std::array<float, 8> c{};
  const auto coefficients = ins.gain_coefficients();
  for (std::size_t k = 0; k < c.size(); ++k) c[k] = static_cast<float>(coefficients[k]);
  const float a = c[0] * t + c[1];
  const float b = c[3] * t + c[4];
  const float d = c[6] * t + c[7];
  for (std::size_t k = 0; k < table.size(); ++k) {
    const double x = static_cast<double>(k) * 1e6 / static_cast<double>(fs);  // microseconds
    const auto db = static_cast<float>(a * std::exp(-x / c[2]) + b * std::exp(-x / c[5]) + d);
    table[k] = static_cast<float>(std::pow(10.0, 0.05 * db));
  }
}

int read_gain_table(const std::string& insPath, std::span<float> table) {
  gain_table(InsRecord::read(insPath), table);
  return 0;
}

}  // namespace sar::envisat

#include "envisat/fbaq.hpp"

#include <algorithm>
#include <cmath>
#include <cstddef>
#include <stdexcept>

#if defined(__x86_64__)
#include <immintrin.h>
#define SAR_FBAQ_AVX512 1
#endif

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

#ifdef SAR_FBAQ_AVX512
// Decodes the whole blocks of one line with AVX-512: a block's 64 bytes are four runs of 16,
// each widened to 16 lanes whose nibbles pick the I and the Q level from the block's two rows
// held in registers. The first run starts with the threshold byte, whose pair is decoded and
// then masked out of the division and the store. The short block, if any, is left to the caller.
// Division is IEEE in every path, so the floats are those of the scalar path.
[[gnu::target("avx512f")]] void whole_blocks_avx512(const float* levels, const std::uint8_t* p,
                                                     std::int64_t blocks, const float* divisors, float* out) {
  const __m512i lowNibble = _mm512_set1_epi32(15);
  const __m512i mixLow = _mm512_setr_epi32(0, 16, 1, 17, 2, 18, 3, 19, 4, 20, 5, 21, 6, 22, 7, 23);
  const __m512i mixHigh = _mm512_setr_epi32(8, 24, 9, 25, 10, 26, 11, 27, 12, 28, 13, 29, 14, 30, 15, 31);
  constexpr __mmask16 kSkipThreshold = 0xfffc;
  constexpr __mmask16 kAll = 0xffff;
  for (std::int64_t b = 0; b < blocks; ++b, p += kFbaqBlockBytes) {
    const float* row = levels + 32 * p[0];
    const __m512 iRow = _mm512_loadu_ps(row);
    const __m512 qRow = _mm512_loadu_ps(row + 16);
    // Block byte 16 j + m is sample 16 j + m - 1: its pair lands two floats before the run's start.
    float* o = out + 2 * kFbaqBlockSamples * b - 2;
    const float* d = divisors + 2 * kFbaqBlockSamples * b - 2;
    for (int j = 0; j < 4; ++j, o += 32, d += 32) {
      // The all-lanes masked forms: the plain ones trip g++ 12's maybe-uninitialized warning.
      const __m512i v =
          _mm512_maskz_cvtepu8_epi32(kAll, _mm_loadu_si128(reinterpret_cast<const __m128i*>(p + 16 * j)));
      const __m512 iv = _mm512_maskz_permutexvar_ps(kAll, _mm512_maskz_srli_epi32(kAll, v, 4), iRow);
      const __m512 qv = _mm512_maskz_permutexvar_ps(kAll, _mm512_and_si512(v, lowNibble), qRow);
      const __m512 first = _mm512_permutex2var_ps(iv, mixLow, qv);
      const __m512 second = _mm512_permutex2var_ps(iv, mixHigh, qv);
      if (j == 0) {
        const __m512 g = _mm512_maskz_loadu_ps(kSkipThreshold, d);
        _mm512_mask_storeu_ps(o, kSkipThreshold, _mm512_maskz_div_ps(kSkipThreshold, first, g));
      } else {
        _mm512_storeu_ps(o, _mm512_div_ps(first, _mm512_loadu_ps(d)));
      }
      _mm512_storeu_ps(o + 16, _mm512_div_ps(second, _mm512_loadu_ps(d + 16)));
    }
  }
}

bool have_avx512() {
  static const bool yes = __builtin_cpu_supports("avx512f");
  return yes;
}
#else
void whole_blocks_avx512(const float*, const std::uint8_t*, std::int64_t, const float*, float*) {}
bool have_avx512() { return false; }
#endif

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

FbaqEchoDecoder::FbaqEchoDecoder(const FbaqTables& tables) : levels_(256 * 32) {
  for (int t = 0; t < 256; ++t)
    for (std::size_t code = 0; code < 16; ++code) {
      float* row = levels_.data() + 32 * t;
      row[code] = tables.i(kFbaqCodeMap[code], t);
      row[16 + code] = tables.q(kFbaqCodeMap[code], t);
    }
}

bool FbaqEchoDecoder::decode(std::span<const std::uint8_t> payload, std::span<float> out, int samples,
                             int& floatCount, int& lineCount) const {
  const auto size = static_cast<std::int64_t>(payload.size());
  if (!packet_fits_echo(samples, size)) return false;
  const EchoLineLayout l = echo_line_layout(samples);
  const std::int64_t lines = size / l.lineBytes;
  need(out, 2 * std::int64_t{samples} * lines);

  // Decodes `count` sample bytes after the threshold byte at `block`.
  float* o = out.data();
  const float* levels = levels_.data();
  auto decode_block = [&o, levels](const std::uint8_t* block, std::int64_t count) {
    const float* iRow = levels + 32 * block[0];
    const float* qRow = iRow + 16;
    for (std::int64_t s = 1; s <= count; ++s, o += 2) {
      const unsigned v = block[s];
      o[0] = iRow[v >> 4];
      o[1] = qRow[v & 15];
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
  floatCount = static_cast<int>(2 * samples * lines);
  lineCount = static_cast<int>(lines);
  return true;
}

bool FbaqEchoDecoder::decode_divided(std::span<const std::uint8_t> payload, std::span<float> out, int samples,
                                     std::span<const float> divisors, int& floatCount, int& lineCount) const {
  const auto size = static_cast<std::int64_t>(payload.size());
  if (!packet_fits_echo(samples, size)) return false;
  const EchoLineLayout l = echo_line_layout(samples);
  const std::int64_t lines = size / l.lineBytes;
  const std::int64_t lineFloats = 2 * std::int64_t{samples};
  need(out, lineFloats * lines);
  if (static_cast<std::int64_t>(divisors.size()) < lineFloats)
    throw std::invalid_argument("FBAQ divisors of " + std::to_string(divisors.size()) + " floats, " +
                                std::to_string(lineFloats) + " needed");
  const bool wide = have_avx512();
  const float* levels = levels_.data();
  const float* g = divisors.data();
  const std::uint8_t* p = payload.data();
  for (std::int64_t line = 0; line < lines; ++line, p += l.lineBytes) {
    float* o = out.data() + lineFloats * line;
    std::int64_t done = 0;  // floats decoded and divided
    if (wide) {
      whole_blocks_avx512(levels, p, l.wholeBlocks, g, o);
      done = 2 * kFbaqBlockSamples * l.wholeBlocks;
    }
    // What the wide path left, all blocks or the short block alone: looked up, then divided as
    // one run, which the compiler vectorises.
    const std::int64_t from = done;
    for (const std::uint8_t* block = p + done / (2 * kFbaqBlockSamples) * kFbaqBlockBytes; done < lineFloats;
         block += kFbaqBlockBytes) {
      const float* iRow = levels + 32 * block[0];
      const float* qRow = iRow + 16;
      const std::int64_t count = std::min<std::int64_t>(kFbaqBlockSamples, (lineFloats - done) / 2);
      for (std::int64_t s = 1; s <= count; ++s, done += 2) {
        const unsigned v = block[s];
        o[done] = iRow[v >> 4];
        o[done + 1] = qRow[v & 15];
      }
    }
    for (std::int64_t k = from; k < lineFloats; ++k) o[k] /= g[k];
  }
  floatCount = static_cast<int>(lineFloats * lines);
  lineCount = static_cast<int>(lines);
  return true;
}

int fbaq_decode84_f(const FbaqTables& tables, std::span<const std::uint8_t> payload, std::span<float> out,
                    int samples, int divisor, int& floatCount, int& lineCount, bool reportMismatch) {
  const int n = divided(samples, divisor);
  if (!packet_fits_echo(n, static_cast<std::int64_t>(payload.size()))) {
    if (reportMismatch) sar::base::report(sar::base::kReportError, kMismatch);
    return 1;
  }
  FbaqEchoDecoder(tables).decode(payload, out, n, floatCount, lineCount);
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

// The bare transforms the wide swath burst chain needs for one burst cycle (one burst of each
// of the five sub-swaths), as the yardstick of the WS job: per burst, a forward and a backward
// transform of every echo at the range correlation length; the omega-K block of the burst
// padded to genpow(3 N) lines (forward in both directions, backward in range, backward in
// azimuth); and per output column the two transforms of the resampling span (two burst cycles
// at the PRF and the margins). bench/ws_job_full.sh multiplies by the bursts of the scene.
// Echoes and PRFs of the sub-swaths are those of the simulator; the window from
// SAR_BENCH_SAMPLES (default 5000); threads from SAR_BENCH_THREADS (default 2).
#include <benchmark/benchmark.h>

#include <array>
#include <cstdlib>
#include <random>

#include "dsp/fft.hpp"

namespace {

using sar::dsp::fcomplex;

int env_int(const char* name, int fallback) {
  const char* v = std::getenv(name);
  return v && std::atoi(v) > 0 ? std::atoi(v) : fallback;
}

const int kSamples = env_int("SAR_BENCH_SAMPLES", 5000);
const int kThreads = env_int("SAR_BENCH_THREADS", 2);
constexpr std::array<int, 5> kEchoes = {51, 66, 56, 73, 61};
constexpr std::array<double, 5> kPrf = {1686.0, 2057.6, 1655.8, 2064.2, 1670.2};
constexpr double kCycle = 0.1915;
constexpr int kReplica = 521;

sar::dsp::cvector random_block(std::size_t n) {
  sar::dsp::cvector v(n);
  std::mt19937 gen(1);
  std::uniform_real_distribution<float> u(-20.0f, 20.0f);
  for (auto& s : v) s = {u(gen), u(gen)};
  return v;
}

void BM_WsCycleTransforms(benchmark::State& state) {
  sar::dsp::set_fft_threads(kThreads);
  const int L = sar::dsp::genpow(kSamples, 1);
  const int M = kSamples - kReplica + 1;
  sar::dsp::cvector range = random_block(static_cast<std::size_t>(80) * L);
  sar::dsp::cvector block = random_block(static_cast<std::size_t>(sar::dsp::genpow(3 * 80, 1)) * M);
  sar::dsp::cvector column = random_block(8192);
  for (auto _ : state) {
    for (std::size_t s = 0; s < kEchoes.size(); ++s) {
      const int N = kEchoes[s];
      sar::dsp::fft_c(L, L, N, N, 1, 0, range);
      sar::dsp::fft_c(L, L, N, N, -1, 0, range);
      const int Nf = sar::dsp::genpow(3 * N, 1);
      sar::dsp::fft_c(M, M, Nf, Nf, 1, 1, block);
      sar::dsp::fft_c(M, M, Nf, Nf, -1, 0, block);
      sar::dsp::fft_c(M, M, Nf, Nf, 0, -1, block);
      const int len = sar::dsp::genpow(static_cast<int>(2.0 * kCycle * kPrf[s]) + 65, 1);
      for (int c = 0; c < M; ++c) {
        sar::dsp::fft_c(len, len, 1, 1, 1, 0, column);
        sar::dsp::fft_c(len, len, 1, 1, -1, 0, column);
      }
    }
    benchmark::DoNotOptimize(block.data());
  }
  state.counters["samples"] = kSamples;
}

}  // namespace

BENCHMARK(BM_WsCycleTransforms)->Unit(benchmark::kMillisecond)->UseRealTime();
BENCHMARK_MAIN();

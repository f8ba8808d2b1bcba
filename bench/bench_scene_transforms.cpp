// The bare transforms a stripmap scene needs, as the yardstick of the whole IM job: a forward
// and a backward transform over every range line (at the padded length range compression
// uses) and over every azimuth column (the whole scene's length, laid out contiguously),
// through the kit's engine,
// planned by estimate as the jobs plan. bench/im_job_full.sh runs the job and this in one go
// and prints the ratio. Scene size from SAR_BENCH_LINES and SAR_BENCH_SAMPLES (default the
// full IM scene, 30000 x 5616, about 1.4 GB); threads from SAR_BENCH_THREADS (default 2).
#include <benchmark/benchmark.h>

#include <cstdlib>
#include <random>

#include "dsp/fft.hpp"

namespace {

using sar::dsp::fcomplex;

int env_int(const char* name, int fallback) {
  const char* v = std::getenv(name);
  return v && std::atoi(v) > 0 ? std::atoi(v) : fallback;
}

const int kLines = env_int("SAR_BENCH_LINES", 30000);
const int kSamples = env_int("SAR_BENCH_SAMPLES", 5616);
const int kThreads = env_int("SAR_BENCH_THREADS", 2);
// Range compression pads a line by the replica (521 samples) to a length of small factors.
const int kPadded = sar::dsp::genpow(kSamples + 521, 1);

sar::dsp::cvector& scene() {
  static sar::dsp::cvector m = [] {
    sar::dsp::cvector v(static_cast<std::size_t>(kLines) * kPadded);
    std::mt19937 gen(1);
    std::uniform_real_distribution<float> u(-20.0f, 20.0f);
    for (auto& s : v) s = {u(gen), u(gen)};
    return v;
  }();
  return m;
}

// Both benchmarks carry the same counters, as the CSV report requires.
void set_counters(benchmark::State& state) {
  state.counters["lines"] = kLines;
  state.counters["samples"] = kSamples;
  state.counters["padded"] = kPadded;
}

void BM_RangeLines(benchmark::State& state) {
  sar::dsp::set_fft_threads(kThreads);
  auto& m = scene();
  for (auto _ : state) {
    sar::dsp::fft_c(kPadded, kPadded, kLines, kLines, 1, 0, m);
    sar::dsp::fft_c(kPadded, kPadded, kLines, kLines, -1, 0, m);
    benchmark::DoNotOptimize(m.data());
  }
  state.SetItemsProcessed(state.iterations() * kLines);
  set_counters(state);
}

void BM_AzimuthColumns(benchmark::State& state) {
  sar::dsp::set_fft_threads(kThreads);
  auto& m = scene();
  for (auto _ : state) {
    // Columns as contiguous rows (the scene transposed): the cheapest way to transform them,
    // so the yardstick does not flatter the job.
    sar::dsp::fft_c(kLines, kLines, kSamples, kSamples, 1, 0, m);
    sar::dsp::fft_c(kLines, kLines, kSamples, kSamples, -1, 0, m);
    benchmark::DoNotOptimize(m.data());
  }
  state.SetItemsProcessed(state.iterations() * kSamples);
  set_counters(state);
}

// The same column transforms across the rows of the row-major scene, as the focusing kernels
// run them: about twice the contiguous cost (copying chunks of columns into rows first costs as
// much as it saves).
void BM_AzimuthColumnsInPlace(benchmark::State& state) {
  sar::dsp::set_fft_threads(kThreads);
  auto& m = scene();
  for (auto _ : state) {
    sar::dsp::fft_c(kPadded, kSamples, kLines, kLines, 0, 1, m);
    sar::dsp::fft_c(kPadded, kSamples, kLines, kLines, 0, -1, m);
    benchmark::DoNotOptimize(m.data());
  }
  state.SetItemsProcessed(state.iterations() * kSamples);
  set_counters(state);
}

const bool planning = [] {
  sar::dsp::set_fft_planning(sar::dsp::FftPlanning::Estimate);
  return true;
}();

BENCHMARK(BM_RangeLines)->Unit(benchmark::kMillisecond)->UseRealTime()->Iterations(2);
BENCHMARK(BM_AzimuthColumns)->Unit(benchmark::kMillisecond)->UseRealTime()->Iterations(2);
BENCHMARK(BM_AzimuthColumnsInPlace)->Unit(benchmark::kMillisecond)->UseRealTime()->Iterations(2);

}  // namespace

BENCHMARK_MAIN();

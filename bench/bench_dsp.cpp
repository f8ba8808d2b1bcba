// Throughput of the transform kit against FFTW called directly, on full-size scenes:
//  - a batch of 4096 range lines of 8192 samples, forward (code 1) then backward (code -1);
//  - column transforms over a 4096 x 5616 block (lines x samples), forward then backward.
// FFTW direct plans the whole batch at once (FFTW_MEASURE, FFTW's own threads) and applies the
// same 1/L afterwards, so both sides compute the same result. The argument is the thread
// count. Items are transformed samples (two per sample and iteration); compare
// items_per_second. Planning happens once per shape and thread count, outside the timing.
// Chirp-Z transforms called again and again on one plan, as their two users do:
//  - the Stolt interpolation: one line of 5 616 samples zoomed to 6 000 per call, the same
//    step and a start that changes from line to line, on 1 or 2 threads sharing the plan;
//  - the beat spectra of the ambiguity estimator: 56 series of 512 lines zoomed to 184
//    frequencies per call, step and start fixed.
// Items are lines (series) transformed.
#include <benchmark/benchmark.h>
#include <fftw3.h>

#include <map>
#include <numbers>
#include <random>
#include <thread>
#include <utility>
#include <vector>

#include "dsp/czt.hpp"
#include "dsp/fft.hpp"

namespace {

using sar::dsp::cvector;
using sar::dsp::fcomplex;

constexpr int kLines = 4096;
constexpr int kRangeSamples = 8192;
constexpr int kBlockSamples = 5616;

cvector& buffer(std::size_t n) {
  static std::map<std::size_t, cvector> buffers;
  auto it = buffers.find(n);
  if (it == buffers.end()) {
    cvector v(n);
    std::mt19937 gen(1);
    std::uniform_real_distribution<float> u(-1.0f, 1.0f);
    for (auto& s : v) s = {u(gen), u(gen)};
    it = buffers.emplace(n, std::move(v)).first;
  }
  return it->second;
}

void scale(cvector& v, double f) {
  float* p = reinterpret_cast<float*>(v.data());
  for (std::size_t i = 0; i < 2 * v.size(); ++i) p[i] = static_cast<float>(p[i] * f);
}

// FFTW direct: one plan pair per (shape, threads), planned on the benchmark buffer before use.
struct DirectPlans {
  fftwf_plan forward = nullptr, backward = nullptr;
};

DirectPlans& direct(bool columns, int threads) {
  static std::map<std::pair<bool, int>, DirectPlans> plans;
  auto key = std::make_pair(columns, threads);
  auto it = plans.find(key);
  if (it != plans.end()) return it->second;
  sar::dsp::fft_cached_plans();  // the kit initialises FFTW's threads once per process
  fftwf_plan_with_nthreads(threads);
  DirectPlans p;
  if (columns) {
    int n = kLines;
    cvector& v = buffer(static_cast<std::size_t>(kLines) * kBlockSamples);
    auto* b = reinterpret_cast<fftwf_complex*>(v.data());
    p.forward = fftwf_plan_many_dft(1, &n, kBlockSamples, b, nullptr, kBlockSamples, 1, b, nullptr, kBlockSamples, 1,
                                    FFTW_FORWARD, FFTW_MEASURE);
    p.backward = fftwf_plan_many_dft(1, &n, kBlockSamples, b, nullptr, kBlockSamples, 1, b, nullptr, kBlockSamples,
                                     1, FFTW_BACKWARD, FFTW_MEASURE);
  } else {
    int n = kRangeSamples;
    cvector& v = buffer(static_cast<std::size_t>(kLines) * kRangeSamples);
    auto* b = reinterpret_cast<fftwf_complex*>(v.data());
    p.forward = fftwf_plan_many_dft(1, &n, kLines, b, nullptr, 1, kRangeSamples, b, nullptr, 1, kRangeSamples,
                                    FFTW_FORWARD, FFTW_MEASURE);
    p.backward = fftwf_plan_many_dft(1, &n, kLines, b, nullptr, 1, kRangeSamples, b, nullptr, 1, kRangeSamples,
                                     FFTW_BACKWARD, FFTW_MEASURE);
  }
  // Planning overwrote the buffer: refill it.
  cvector& v = buffer(columns ? static_cast<std::size_t>(kLines) * kBlockSamples
                              : static_cast<std::size_t>(kLines) * kRangeSamples);
  std::mt19937 gen(2);
  std::uniform_real_distribution<float> u(-1.0f, 1.0f);
  for (auto& s : v) s = {u(gen), u(gen)};
  return plans.emplace(key, p).first->second;
}

void BM_KitRangeLines(benchmark::State& state) {
  sar::dsp::set_fft_threads(static_cast<int>(state.range(0)));
  cvector& v = buffer(static_cast<std::size_t>(kLines) * kRangeSamples);
  sar::dsp::fft_plan fwd, bwd;
  sar::dsp::fft_makep_c(fwd, kRangeSamples, kRangeSamples, kLines, kLines, 1, 0, 1);
  sar::dsp::fft_makep_c(bwd, kRangeSamples, kRangeSamples, kLines, kLines, -1, 0, 1);
  for (auto _ : state) {
    sar::dsp::pfft_c(fwd, v);
    sar::dsp::pfft_c(bwd, v);
    benchmark::ClobberMemory();
  }
  state.SetItemsProcessed(state.iterations() * 2 * static_cast<int64_t>(v.size()));
}

void BM_FftwRangeLines(benchmark::State& state) {
  DirectPlans& p = direct(false, static_cast<int>(state.range(0)));
  cvector& v = buffer(static_cast<std::size_t>(kLines) * kRangeSamples);
  auto* b = reinterpret_cast<fftwf_complex*>(v.data());
  for (auto _ : state) {
    fftwf_execute_dft(p.forward, b, b);
    fftwf_execute_dft(p.backward, b, b);
    scale(v, 1.0 / kRangeSamples);
    benchmark::ClobberMemory();
  }
  state.SetItemsProcessed(state.iterations() * 2 * static_cast<int64_t>(v.size()));
}

void BM_KitColumns(benchmark::State& state) {
  sar::dsp::set_fft_threads(static_cast<int>(state.range(0)));
  cvector& v = buffer(static_cast<std::size_t>(kLines) * kBlockSamples);
  sar::dsp::fft_plan fwd, bwd;
  sar::dsp::fft_makep_c(fwd, kBlockSamples, kBlockSamples, kLines, kLines, 0, 1, 1);
  sar::dsp::fft_makep_c(bwd, kBlockSamples, kBlockSamples, kLines, kLines, 0, -1, 1);
  for (auto _ : state) {
    sar::dsp::pfft_c(fwd, v);
    sar::dsp::pfft_c(bwd, v);
    benchmark::ClobberMemory();
  }
  state.SetItemsProcessed(state.iterations() * 2 * static_cast<int64_t>(v.size()));
}

void BM_FftwColumns(benchmark::State& state) {
  DirectPlans& p = direct(true, static_cast<int>(state.range(0)));
  cvector& v = buffer(static_cast<std::size_t>(kLines) * kBlockSamples);
  auto* b = reinterpret_cast<fftwf_complex*>(v.data());
  for (auto _ : state) {
    fftwf_execute_dft(p.forward, b, b);
    fftwf_execute_dft(p.backward, b, b);
    scale(v, 1.0 / kLines);
    benchmark::ClobberMemory();
  }
  state.SetItemsProcessed(state.iterations() * 2 * static_cast<int64_t>(v.size()));
}

constexpr int kStoltSamples = 5616;
constexpr int kStoltBins = 6000;
constexpr int kStoltLines = 64;

void BM_CztStoltLines(benchmark::State& state) {
  const int threads = static_cast<int>(state.range(0));
  cvector& in = buffer(static_cast<std::size_t>(kStoltLines) * kStoltSamples);
  sar::dsp::czt_plan plan;
  sar::dsp::czt_makep_c(plan, kStoltSamples, kStoltBins);
  std::vector<cvector> out(static_cast<std::size_t>(threads), cvector(kStoltBins));
  const double a = -2.0 * std::numbers::pi / kStoltBins;
  auto lines = [&](int t) {
    for (int j = t; j < kStoltLines; j += threads) {
      const fcomplex* row = in.data() + static_cast<std::ptrdiff_t>(j) * kStoltSamples;
      sar::dsp::pczt_c(plan, std::span<const fcomplex>(row, kStoltSamples), out[static_cast<std::size_t>(t)], a,
                       0.3 + 1e-3 * j, 1);
    }
  };
  for (auto _ : state) {
    std::vector<std::jthread> workers;
    for (int t = 1; t < threads; ++t) workers.emplace_back(lines, t);
    lines(0);
    workers.clear();
    benchmark::ClobberMemory();
  }
  state.SetItemsProcessed(state.iterations() * kStoltLines);
}

constexpr int kBeatLines = 512;
constexpr int kBeatBins = 184;
constexpr int kBeatSeries = 56;

void BM_CztBeatSpectra(benchmark::State& state) {
  cvector& in = buffer(static_cast<std::size_t>(kBeatSeries) * kBeatLines);
  sar::dsp::czt_plan plan;
  sar::dsp::czt_makep_c(plan, kBeatLines, kBeatBins);
  cvector out(static_cast<std::size_t>(kBeatSeries) * kBeatBins);
  for (auto _ : state) {
    sar::dsp::pczt_c(plan, in, out, -2.0 * std::numbers::pi * 1e-4, 2.0 * std::numbers::pi * -0.0092, kBeatSeries);
    benchmark::ClobberMemory();
  }
  state.SetItemsProcessed(state.iterations() * kBeatSeries);
}

BENCHMARK(BM_CztStoltLines)->Arg(1)->Arg(2)->UseRealTime()->Unit(benchmark::kMillisecond);
BENCHMARK(BM_CztBeatSpectra)->UseRealTime()->Unit(benchmark::kMillisecond);
BENCHMARK(BM_KitRangeLines)->Arg(1)->Arg(2)->UseRealTime()->Unit(benchmark::kMillisecond);
BENCHMARK(BM_FftwRangeLines)->Arg(1)->Arg(2)->UseRealTime()->Unit(benchmark::kMillisecond);
BENCHMARK(BM_KitColumns)->Arg(1)->Arg(2)->UseRealTime()->Unit(benchmark::kMillisecond);
BENCHMARK(BM_FftwColumns)->Arg(1)->Arg(2)->UseRealTime()->Unit(benchmark::kMillisecond);

}  // namespace

BENCHMARK_MAIN();

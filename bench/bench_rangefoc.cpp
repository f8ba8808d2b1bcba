// Range compression of IM lines in core mode (correlation with the replica, window alignment,
// repacking) against the bare kit transforms it needs (forward and backward over every line of
// the same padded length), measured in the same run. Lines of 5616 samples with a replica of
// 521 samples (27.1 us at 19.21 MHz). The first argument is the line count, the second the
// thread count. Set SAR_BENCH_FULL=1 to add the full 30000-line scene (about 1.4 GB).
// Items are lines: compare items_per_second of the two benchmarks at the same arguments.
// Transforms are planned by estimate, as the jobs plan them.
#include <benchmark/benchmark.h>
#include <omp.h>

#include <cstdlib>
#include <random>

#include "dsp/fft.hpp"
#include "stripmap/range_focus.hpp"

namespace {

using sar::dsp::fcomplex;

constexpr int kSamples = 5616;
constexpr int kReplica = 521;
constexpr double kFs = 19.20768e6;

template <class Matrix>
void fill(Matrix& m, std::size_t n) {
  m.resize(n);
  std::mt19937 gen(1);
  std::uniform_real_distribution<float> u(-20.0f, 20.0f);
  for (auto& s : m) s = {u(gen), u(gen)};
}

void setup(sar::stripmap::sarpar& par, sar::stripmap::procparm& proc, int lines) {
  par.samples = kSamples;
  par.lines = lines;
  par.samplingRate = kFs;
  par.nearRangeTime = 5.5e-3;
  par.far_range_time = par.nearRangeTime + 24 / kFs;
  proc.replica.assign(kReplica, fcomplex(1.0f, 0.5f));
  proc.replicaLength = kReplica;
  proc.Flag_incore = 1;
  proc.Flag_swstal = 1;
  proc.Flag_ortog = 1;  // as the IM job runs it
}

void BM_RangeCompression(benchmark::State& state) {
  const int lines = static_cast<int>(state.range(0));
  sar::dsp::set_fft_threads(static_cast<int>(state.range(1)));
  omp_set_num_threads(static_cast<int>(state.range(1)));
  sar::stripmap::sarpar par;
  sar::stripmap::procparm proc;
  setup(par, proc, lines);
  sar::stripmap::RangeSizes z;
  sar::stripmap::range_sizes(par, proc, z);
  {  // plans made outside the timing
    sar::dsp::cvector m(static_cast<std::size_t>(lines) * z.padded);
    sar::dsp::fft_c(z.padded, z.padded, lines, lines, 1, 0, m);
    sar::dsp::fft_c(z.padded, z.padded, lines, lines, -1, 0, m);
  }
  for (auto _ : state) {
    state.PauseTiming();
    fill(proc.matrix, static_cast<std::size_t>(lines) * z.padded);
    proc.lineShifts.assign(static_cast<std::size_t>(lines), 0);
    proc.paddedLength = z.padded;
    state.ResumeTiming();
    sar::stripmap::rangefoc(par, proc);
    benchmark::DoNotOptimize(proc.matrix.data());
  }
  state.SetItemsProcessed(state.iterations() * lines);
  state.counters["padded"] = z.padded;
}

void BM_BareTransforms(benchmark::State& state) {
  const int lines = static_cast<int>(state.range(0));
  sar::dsp::set_fft_threads(static_cast<int>(state.range(1)));
  sar::stripmap::sarpar par;
  sar::stripmap::procparm proc;
  setup(par, proc, lines);
  sar::stripmap::RangeSizes z;
  sar::stripmap::range_sizes(par, proc, z);
  sar::dsp::cvector m;
  fill(m, static_cast<std::size_t>(lines) * z.padded);
  sar::dsp::fft_c(z.padded, z.padded, lines, lines, 1, 0, m);  // plans made outside the timing
  sar::dsp::fft_c(z.padded, z.padded, lines, lines, -1, 0, m);
  for (auto _ : state) {
    sar::dsp::fft_c(z.padded, z.padded, lines, lines, 1, 0, m);
    sar::dsp::fft_c(z.padded, z.padded, lines, lines, -1, 0, m);
    benchmark::DoNotOptimize(m.data());
  }
  state.SetItemsProcessed(state.iterations() * lines);
}

void sizes(benchmark::internal::Benchmark* b) {
  for (int threads : {1, 2}) {
    b->Args({4096, threads});
    if (std::getenv("SAR_BENCH_FULL")) b->Args({30000, threads});
  }
  b->Unit(benchmark::kMillisecond)->UseRealTime();
}

// The jobs plan by estimate (reproducible reruns); so does this comparison.
const bool planning = [] {
  sar::dsp::set_fft_planning(sar::dsp::FftPlanning::Estimate);
  return true;
}();

BENCHMARK(BM_BareTransforms)->Apply(sizes);
BENCHMARK(BM_RangeCompression)->Apply(sizes);

}  // namespace

BENCHMARK_MAIN();

// Doppler centroid estimation of a range-compressed image mode scene, in core mode: the whole
// estimator (block statistics, polynomial, WDAR and MLBF on their blocks, result file), the
// block statistics alone and the two ambiguity estimators alone on the blocks the estimator
// chose. A full scene (about 30 000 lines of 5 000 samples, 1.2 GB of samples)
// is scaled to 8 192 lines of 5 120 samples; items are lines, so items_per_second is lines per
// second and scales to the full size. The scene repeats a simulated tile of 2 048 lines with a
// bright near-range part, so that both ambiguity estimators have blocks to work on. Block
// statistics and the blocks of each ambiguity estimator run on the OpenMP threads
// (OMP_NUM_THREADS); the results do not depend on their number.
#include <benchmark/benchmark.h>

#include <array>
#include <filesystem>
#include <vector>

#include "../tests/doppler/test_support.hpp"
#include "doppler/dcest.hpp"

namespace {

using namespace sar::doppler;

constexpr int kTileLines = 2048;
constexpr int kLines = 8192;
constexpr int kSamples = 5120;

struct Scene {
  testing::SceneSpec shape;
  std::vector<fcomplex> data;
  Scene() {
    shape.lines = kTileLines;
    shape.samples = kSamples;
    shape.centroid = 1.6 * shape.prf;
    shape.centroidSlope = -0.02;
    shape.highContrast = true;
    shape.brightFraction = 0.3;
    shape.brightSpacing = 1024;
    shape.brightPower = 1000.0;
    const auto tile = testing::make_scene(shape);
    testing::clear_reflectivity_cache();
    data.reserve(static_cast<std::size_t>(kLines) * kSamples);
    for (int k = 0; k < kLines / kTileLines; ++k) data.insert(data.end(), tile.begin(), tile.end());
    shape.lines = kLines;
  }
};

Scene& scene() {
  static Scene s;
  return s;
}

dcestconf config(int ambFlag) {
  dcestconf c = testing::estimator_config();
  c.Amb_flag = ambFlag;
  c.Nwdarblocks = 40;
  c.Nbestblocks = 20;
  c.Nummlbf = 8;
  c.coreMatrix = scene().data;
  c.geometricCentroid = scene().shape.centroid;
  return c;
}

void BM_EstimateDoppler(benchmark::State& state) {
  const auto dir = std::filesystem::temp_directory_path() / "bench_doppler";
  std::filesystem::create_directories(dir);
  {
    // Transform plans are made once per shape and process: not part of the estimation.
    dcestconf c = config(static_cast<int>(state.range(0)));
    dcimage image = testing::image_of(scene().shape);
    DopplerPoly poly{};
    getnadcpoly(image, c, poly);
  }
  for (auto _ : state) {
    dcestconf c = config(static_cast<int>(state.range(0)));
    c.outputDir = dir.string();
    dcimage image = testing::image_of(scene().shape);
    DopplerPoly poly{};
    if (getnadcpoly(image, c, poly) != 0) state.SkipWithError("estimation failed");
    benchmark::DoNotOptimize(poly);
  }
  state.SetItemsProcessed(state.iterations() * kLines);
}
// 1: with WDAR and MLBF; 2: polynomial only, ambiguity from the orbit geometry.
BENCHMARK(BM_EstimateDoppler)->Arg(1)->Arg(2)->Unit(benchmark::kMillisecond)->UseRealTime();

void BM_BlockStatistics(benchmark::State& state) {
  for (auto _ : state) {
    dcestconf c = config(1);
    dcimage image = testing::image_of(scene().shape);
    c.r0 = bspline3(0.0);
    c.r1 = bspline3(2.0 * image.platformSpeed / (c.AnLen * image.prf));
    if (setprocbuf(c, image) != 0 || getnadcbins(c, image) != 0) state.SkipWithError("block statistics failed");
    benchmark::DoNotOptimize(c.blocks.data());
  }
  state.SetItemsProcessed(state.iterations() * kLines);
}
BENCHMARK(BM_BlockStatistics)->Unit(benchmark::kMillisecond)->UseRealTime();

// MLBF on Nbestblocks blocks (Nummlbf look pairs each) and WDAR on Nwdarblocks blocks, with
// their inits, as the estimator runs them; items are the scene's lines, as above.
void BM_AmbiguityEstimators(benchmark::State& state) {
  dcestconf c = config(1);
  dcimage image = testing::image_of(scene().shape);
  DopplerPoly poly{};
  if (getnadcpoly(image, c, poly) != 0 || c.mlbfBlocks.empty() || c.wdarBlocks.empty()) {
    state.SkipWithError("no blocks for the ambiguity estimators");
    return;
  }
  // The polynomial in cycles of sample and line indices, as the estimator hands it over.
  const double prf = image.prf, fs = c.fs;
  const std::array<double, 7> coef = {poly[0] / prf,        poly[1] / (prf * fs), poly[2] / (prf * prf), poly[3] / (prf * prf * fs),
                                      poly[4] / (prf * fs * fs), poly[5] / (prf * fs * fs * fs),
                                      poly[6] / (prf * fs * fs * fs * fs)};
  for (auto _ : state) {
    if (bestblocksproc(c, image, coef) != 0) state.SkipWithError("ambiguity estimators failed");
    benchmark::DoNotOptimize(c.mlbfBlocks.data());
  }
  state.SetItemsProcessed(state.iterations() * kLines);
}
BENCHMARK(BM_AmbiguityEstimators)->Unit(benchmark::kMillisecond)->UseRealTime();

}  // namespace

BENCHMARK_MAIN();

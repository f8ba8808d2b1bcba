// Raster window reads of a large complex raster through DataFile/BufferIO and BufferFile.
//
// The argument is the raster size in MiB (64 for a quick look, 1024 for the full run). Each size's
// raster is written once into the temporary folder (or $SAR_BENCH_DIR) before its first
// benchmark and removed when the run ends. Reads come from the page cache after the first pass,
// so the figures measure the engine's own path: seeks, buffering, swapping and conversion.
#include <benchmark/benchmark.h>

#include <unistd.h>

#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <map>
#include <string>
#include <vector>

#include "io/buffer_file.hpp"
#include "io/data_file.hpp"

namespace fs = std::filesystem;
using namespace sar::io;

namespace {

constexpr int kPixels = 8192;  // 64 KiB a line of FLOAT_COMPLEX
constexpr int64_t kLineBytes = int64_t{kPixels} * 8;

std::map<int64_t, std::string>& rasters() {
  static std::map<int64_t, std::string> files;
  return files;
}

void remove_rasters() {
  std::error_code ec;
  for (const auto& [mib, path] : rasters()) {
    fs::remove(path, ec);
    fs::remove(path + ".hdr", ec);
    fs::remove(path + ".vrt", ec);
  }
  rasters().clear();
}

// The raster of `mib` MiB, made on first use: FLOAT_COMPLEX, little-endian, no prefix.
const std::string& raster(int64_t mib) {
  auto it = rasters().find(mib);
  if (it != rasters().end()) return it->second;
  const char* dir = std::getenv("SAR_BENCH_DIR");
  const fs::path base = dir != nullptr ? fs::path(dir) : fs::temp_directory_path();
  const std::string path =
      (base / ("sar_bench_io_" + std::to_string(::getpid()) + "_" + std::to_string(mib) + ".raw")).string();
  rasters()[mib] = path;  // registered before writing, so a failed write is cleaned up too
  DataFile f(path);
  f.pixels = kPixels;
  f.lines = static_cast<int32_t>(mib * 1024 * 1024 / kLineBytes);
  f.cellType = kFloatComplex;
  f.byteOrder = kLittleEndian;
  f.bufferSize = 1 << 22;
  std::vector<fcomplex> block(static_cast<size_t>(kPixels) * 64);
  for (size_t i = 0; i < block.size(); ++i) block[i] = {static_cast<float>(i % 977), -static_cast<float>(i % 613)};
  for (int32_t l = 0; l < f.lines; l += 64) {
    const int32_t n = std::min(64, f.lines - l);
    if (BufferIO(&f, 0, kPixels, l, n, kFloatComplex).writebuffer(block.data()) != 0) {
      std::fprintf(stderr, "cannot write %s\n", path.c_str());
      std::exit(1);
    }
  }
  if (f.close() != 0 || f.write_hdr() != 0) {
    std::fprintf(stderr, "cannot finish %s\n", path.c_str());
    std::exit(1);
  }
  return rasters()[mib];
}

// Narrow column strips over every line: the access pattern of azimuth processing.
void BM_ColumnStrip(benchmark::State& state) {
  const std::string& path = raster(state.range(0));
  const auto columns = static_cast<int32_t>(state.range(1));
  const auto bufferSize = static_cast<int32_t>(state.range(2));
  DataFile f;
  if (f.read_hdr(path) != 0) {
    state.SkipWithError("no raster");
    return;
  }
  f.bufferSize = bufferSize;
  std::vector<fcomplex> strip(static_cast<size_t>(columns) * f.lines);
  for (auto _ : state) {
    BufferIO io(&f, kPixels / 2, columns, 0, f.lines, kFloatComplex);
    if (io.readbuffer(strip.data()) != 0) state.SkipWithError("read failed");
    benchmark::DoNotOptimize(strip.data());
    f.close();
  }
  state.SetBytesProcessed(state.iterations() * int64_t{columns} * f.lines * 8);
  state.counters["samples/s"] =
      benchmark::Counter(static_cast<double>(state.iterations()) * columns * f.lines, benchmark::Counter::kIsRate);
}

// Full-width blocks of 512 lines, in the file's type or converted to double complex.
void BM_LineBlocks(benchmark::State& state) {
  const std::string& path = raster(state.range(0));
  const auto memType = static_cast<int32_t>(state.range(1));
  DataFile f;
  if (f.read_hdr(path) != 0) {
    state.SkipWithError("no raster");
    return;
  }
  constexpr int32_t kBlock = 512;
  std::vector<unsigned char> block(static_cast<size_t>(kBlock) * kPixels * cell_size(memType));
  for (auto _ : state) {
    for (int32_t l = 0; l < f.lines; l += kBlock) {
      BufferIO io(&f, 0, kPixels, l, std::min(kBlock, f.lines - l), memType);
      if (io.readbuffer(block.data()) != 0) state.SkipWithError("read failed");
    }
    benchmark::DoNotOptimize(block.data());
    f.close();
  }
  state.SetBytesProcessed(state.iterations() * int64_t{f.lines} * kLineBytes);
  state.counters["samples/s"] = benchmark::Counter(static_cast<double>(state.iterations()) * f.lines * kPixels,
                                                   benchmark::Counter::kIsRate);
}

// Line by line through a 32 MiB read-ahead buffer with a 2 MiB keep-back.
void BM_BufferFileLines(benchmark::State& state) {
  const std::string& path = raster(state.range(0));
  BufferFile f;
  if (f.readhdr(path) != 0) {
    state.SkipWithError("no raster");
    return;
  }
  std::vector<fcomplex> line(kPixels);
  for (auto _ : state) {
    f.open(BufferFile::kOpRead);
    f.initbuffer(0x2000000, 0x200000);
    for (int32_t l = 0; l < f.getLines(); ++l) {
      if (f.read(line.data(), kLineBytes) != kLineBytes) state.SkipWithError("read failed");
    }
    benchmark::DoNotOptimize(line.data());
    f.close();
  }
  state.SetBytesProcessed(state.iterations() * int64_t{f.getLines()} * kLineBytes);
}

void sizes(benchmark::internal::Benchmark* b, const std::vector<std::vector<int64_t>>& rest) {
  for (int64_t mib : {64, 1024}) {
    if (rest.empty()) b->Args({mib});
    for (const auto& r : rest) {
      std::vector<int64_t> args{mib};
      args.insert(args.end(), r.begin(), r.end());
      b->Args(args);
    }
  }
}

}  // namespace

// Arguments: raster MiB, strip columns, DataFile buffer bytes (0: unbuffered).
BENCHMARK(BM_ColumnStrip)
    ->ArgNames({"MiB", "columns", "buffer"})
    ->Apply([](auto* b) { sizes(b, {{256, 0}, {256, 1 << 20}, {2048, 1 << 20}}); })
    ->Unit(benchmark::kMillisecond);
// Arguments: raster MiB, memory cell type (0 FLOAT_COMPLEX as stored, 2 DOUBLE_COMPLEX).
BENCHMARK(BM_LineBlocks)
    ->ArgNames({"MiB", "memType"})
    ->Apply([](auto* b) { sizes(b, {{kFloatComplex}, {kDoubleComplex}}); })
    ->Unit(benchmark::kMillisecond);
BENCHMARK(BM_BufferFileLines)->ArgNames({"MiB"})->Apply([](auto* b) { sizes(b, {}); })->Unit(benchmark::kMillisecond);

int main(int argc, char** argv) {
  benchmark::Initialize(&argc, argv);
  if (benchmark::ReportUnrecognizedArguments(argc, argv)) return 1;
  std::atexit(remove_rasters);  // also on the exits above
  benchmark::RunSpecifiedBenchmarks();
  benchmark::Shutdown();
  remove_rasters();
  return 0;
}

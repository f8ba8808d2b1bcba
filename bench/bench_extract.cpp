// Level 0 extraction of a full-size IM product (30 000 lines of 5 616 samples) against reading
// the same bytes with cat into /dev/null.
#include <benchmark/benchmark.h>

#include <chrono>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <string>
#include <vector>

#include "envisat/extract.hpp"

namespace {

namespace fs = std::filesystem;
using namespace sar::envisat;

constexpr int kLines = 30000;
constexpr int kSamples = 5616;
constexpr int kFirstCounter = 5000;

struct BenchProduct {
  fs::path dir = fs::temp_directory_path() / "bench_extract";
  std::string product = (dir / "ASA_IM__0P.N1").string();
  std::string lines = (dir / "EXTR").string();
  int payload = static_cast<int>(echo_line_layout(kSamples).lineBytes);

  BenchProduct() {
    fs::create_directories(dir);
    if (fs::exists(product)) return;
    std::ofstream out(product, std::ios::binary);
    std::string mph = "PRODUCT=\"ASA_IM__0CNPDE20120329_071134_000000163113_00121_52721_6279.N1\"\n";
    mph.resize(1247, ' ');
    std::string sph(1956, ' ');
    sph.replace(16, 6, "ASA_IM");
    sph.replace(775, 5, "H/H  ");
    sph[791] = '2';
    out << mph << sph;
    std::vector<unsigned char> rec(68 + static_cast<std::size_t>(payload));
    for (std::size_t k = 68; k < rec.size(); ++k) rec[k] = static_cast<unsigned char>(k * 37);
    for (int i = 0; i < kLines; ++i) {
      const int c = kFirstCounter + i;
      const int len = payload + 29;
      rec[32] = 0x08 | (1556 >> 8);
      rec[33] = 1556 & 255;
      rec[34] = static_cast<unsigned char>(0xc0 | ((c >> 8) & 63));
      rec[35] = static_cast<unsigned char>(c);
      rec[36] = static_cast<unsigned char>(len >> 8);
      rec[37] = static_cast<unsigned char>(len);
      rec[39] = 29;
      rec[41] = 84;
      rec[48] = static_cast<unsigned char>(c >> 16);
      rec[49] = static_cast<unsigned char>(c >> 8);
      rec[50] = static_cast<unsigned char>(c);
      rec[51] = 2 << 2;
      rec[52] = 0x80;
      rec[56] = 0x04;
      rec[57] = 0xd0;
      out.write(reinterpret_cast<const char*>(rec.data()), static_cast<std::streamsize>(rec.size()));
    }
  }
};

BenchProduct& product() {
  static BenchProduct p;
  return p;
}

void BM_ExtractImFullSize(benchmark::State& state) {
  BenchProduct& p = product();
  FbaqTables tables;
  for (std::size_t k = 0; k < tables.i.values.size(); ++k) tables.i.values[k] = tables.q.values[k] = static_cast<float>(k % 16);
  std::vector<float> gains(kGainTableLength, 1.0f);
  const Level0Header header = read_level0_header(p.product);
  double extractSeconds = 0.0, catSeconds = 0.0;
  for (auto _ : state) {
    auto t0 = std::chrono::steady_clock::now();
    const std::string cat = "cat '" + p.product + "' > /dev/null";
    if (std::system(cat.c_str()) != 0) state.SkipWithError("cat failed");
    auto t1 = std::chrono::steady_clock::now();
    LineTable table;
    table.lines_per_cycle = 1;
    table.cycle_count = kLines;
    table.first_echo_counter = table.first_packet_counter = kFirstCounter;
    table.entries.assign(kLines, LineTableEntry{});
    sarpar s;
    s.samplingRate = 19207680.0;
    s.prf = 1652.0;
    s.samples = kSamples;
    s.swath_rank = 9;
    s.raw_file = p.lines;
    std::vector<sarpar> ch{s};
    extconf conf;
    extract_level0(p.product, header, table, tables, gains, ch, conf);
    auto t2 = std::chrono::steady_clock::now();
    catSeconds += std::chrono::duration<double>(t1 - t0).count();
    extractSeconds += std::chrono::duration<double>(t2 - t1).count();
    state.SetIterationTime(std::chrono::duration<double>(t2 - t1).count());
  }
  state.counters["lines_per_s"] = benchmark::Counter(static_cast<double>(kLines) * static_cast<double>(state.iterations()) / extractSeconds);
  state.counters["ratio_to_cat"] = extractSeconds / catSeconds;
}
BENCHMARK(BM_ExtractImFullSize)->UseManualTime()->Unit(benchmark::kMillisecond)->Iterations(3);

}  // namespace

BENCHMARK_MAIN();

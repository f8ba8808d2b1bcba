// Level 0 extraction of a simulated IM product against plain reads of the same product in the
// same run: `cat product > /dev/null` through the shell, and read(2) into a buffer. The product
// comes from the simulator's command (`sarsim`, point targets), found through SARSIM or beside
// this executable (../tools/sarsim), and is kept in the temporary folder for later runs; without
// the command a product of the same layout is written here. The small scene has 4096 lines of
// 5616 samples; SAR_BENCH_FULL=1 adds the full-size scene of 30000 lines (173 MB in, 1.35 GB out).
//
// Extraction is the whole intake of envi_extract but its progress bar: headers, FBAQ and gain
// tables, timeline table, packet walk. The line file is written in the temporary folder beside the
// product. With fresh:1 it is removed before each iteration (a first run into a new folder); with
// fresh:0 it is overwritten, as on a rerun.
//
// Counters: lines_per_s; ratio_to_cat and ratio_to_read, extraction time over the read time; and
// write_floor_ratio, extraction time over the time of reading the product plus writing as many
// bytes as the line file holds from one buffer (the I/O no extraction can avoid).
#include <benchmark/benchmark.h>
#include <fcntl.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <string>
#include <vector>

#include "base/errors.hpp"
#include "envisat/extract.hpp"
#include "envisat/table_builder.hpp"

namespace {

namespace fs = std::filesystem;
using namespace sar::envisat;
using Clock = std::chrono::steady_clock;

constexpr int kSamples = 5616;

double seconds_since(Clock::time_point t0) { return std::chrono::duration<double>(Clock::now() - t0).count(); }

// The simulator's command: SARSIM, else ../tools/sarsim beside this executable.
std::string sarsim_command() {
  if (const char* s = std::getenv("SARSIM")) return s;
  std::error_code err;
  const fs::path self = fs::read_symlink("/proc/self/exe", err);
  if (err) return {};
  const fs::path tool = self.parent_path().parent_path() / "tools" / "sarsim";
  return fs::exists(tool, err) ? tool.string() : std::string();
}

std::string first_file(const fs::path& dir, const std::string& prefix) {
  std::error_code err;
  for (const auto& e : fs::directory_iterator(dir, err))
    if (e.path().filename().string().starts_with(prefix)) return e.path().string();
  return {};
}

// A product of the simulator's layout without the simulator: echoes of one beam with a fixed
// byte pattern, counters from 5000 on. Decoding costs the same whatever the bytes.
void write_plain_product(const std::string& path, int lines) {
  std::ofstream out(path, std::ios::binary);
  std::string mph = "PRODUCT=\"ASA_IM__0CNPDE20120329_071134_000000163113_00121_52721_6279.N1\"\n";
  mph.resize(1247, ' ');
  std::string sph(1956, ' ');
  sph.replace(16, 6, "ASA_IM");
  sph.replace(775, 5, "H/H  ");
  sph[791] = '2';
  out << mph << sph;
  const int payload = static_cast<int>(echo_line_layout(kSamples).lineBytes);
  std::vector<unsigned char> rec(68 + static_cast<std::size_t>(payload));
  for (std::size_t k = 68; k < rec.size(); ++k) rec[k] = static_cast<unsigned char>(k * 37);
  for (int i = 0; i < lines; ++i) {
    const int c = 5000 + i;
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

// The product of a scene, simulated on first use and kept.
struct Scene {
  std::string level0, ins, lineFile;
  bool simulated = false;
};

Scene scene(int lines) {
  const fs::path dir = fs::temp_directory_path() / "bench_extract" / ("im_" + std::to_string(lines));
  fs::create_directories(dir);
  Scene s;
  s.lineFile = (dir / "EXTR").string();
  s.level0 = first_file(dir, "ASA_IM__0");
  s.ins = first_file(dir, "ASA_INS_AX");
  if (s.level0.empty()) {
    const std::string sarsim = sarsim_command();
    if (!sarsim.empty()) {
      const std::string cmd = "'" + sarsim + "' --out '" + dir.string() + "' --lines " + std::to_string(lines) +
                              " --samples " + std::to_string(kSamples) + " > /dev/null";
      if (std::system(cmd.c_str()) == 0) {
        s.level0 = first_file(dir, "ASA_IM__0");
        s.ins = first_file(dir, "ASA_INS_AX");
      }
    }
  }
  if (s.level0.empty()) {
    s.level0 = (dir / "ASA_IM__0P_plain.N1").string();
    write_plain_product(s.level0, lines);
  }
  s.simulated = !s.ins.empty();
  return s;
}

// read(2) of the whole file into one buffer; returns the bytes read.
std::int64_t read_all(const std::string& path, std::vector<char>& buffer) {
  const int fd = ::open(path.c_str(), O_RDONLY | O_CLOEXEC);
  if (fd < 0) return -1;
  std::int64_t total = 0;
  for (ssize_t n; (n = ::read(fd, buffer.data(), buffer.size())) > 0;) total += n;
  ::close(fd);
  return total;
}

// Writes `bytes` from one buffer over the file at `path`, as the extraction does.
bool write_all(const std::string& path, std::int64_t bytes, const std::vector<char>& buffer) {
  const int fd = ::open(path.c_str(), O_WRONLY | O_CREAT | O_CLOEXEC, 0666);
  if (fd < 0) return false;
  bool ok = true;
  for (std::int64_t left = bytes; left > 0 && ok;) {
    const auto n = static_cast<std::size_t>(std::min<std::int64_t>(left, static_cast<std::int64_t>(buffer.size())));
    ok = ::write(fd, buffer.data(), n) == static_cast<ssize_t>(n);
    left -= static_cast<std::int64_t>(n);
  }
  ok = ::ftruncate(fd, static_cast<off_t>(bytes)) == 0 && ok;
  return ::close(fd) == 0 && ok;
}

// The intake of envi_extract without its progress bar, which needs a host's working file.
int extract(const Scene& s, std::vector<sarpar>& channels) {
  sarpar p;
  p.outputDir = fs::path(s.lineFile).parent_path().string();
  p.extrPath = s.lineFile;
  channels = {p};
  extconf conf;
  const Level0Header header = read_level0_header(s.level0);
  FbaqTables fbaq;
  std::vector<float> gains(kGainTableLength, 1.0f);
  LineTable table;
  if (s.simulated) {
    if (LUTfbaq_f(s.ins, fbaq.q, fbaq.i) != 0 || read_gain_table(s.ins, gains) != 0) return 1;
    if (timeline_table_builder()(s.level0, s.ins, header.mode, table, channels) != 0) return 1;
  } else {
    // A plain product has no ASA_INS: tables and acquisition parameters of its own.
    for (std::size_t k = 0; k < fbaq.i.values.size(); ++k)
      fbaq.i.values[k] = fbaq.q.values[k] = static_cast<float>(k % 16) - 7.5f;
    const std::int64_t lines = (header.fileSize - l0::kFirstMdsr) / (68 + echo_line_layout(kSamples).lineBytes);
    table.lines_per_cycle = 1;
    table.cycle_count = static_cast<std::int32_t>(lines);
    table.first_echo_counter = table.first_packet_counter = 5000;
    table.entries.assign(static_cast<std::size_t>(lines), LineTableEntry{});
    channels[0].samplingRate = 19207680.0;
    channels[0].prf = 1652.0;
    channels[0].samples = kSamples;
    channels[0].swath_rank = 9;
  }
  return extract_level0(s.level0, header, table, fbaq, gains, channels, conf);
}

void BM_ExtractIm(benchmark::State& state) {
  const int lines = static_cast<int>(state.range(0));
  const bool fresh = state.range(1) != 0;
  const Scene s = scene(lines);
  std::vector<char> buffer(0x400000, 1);
  std::vector<sarpar> channels;
  double extractSeconds = 0.0, catSeconds = 0.0, readSeconds = 0.0, writeSeconds = 0.0;
  std::int64_t outLines = 0;
  try {
    if (extract(s, channels) != 0) state.SkipWithError("extraction failed");  // warms the caches
  } catch (const sar::base::CErrorExceptionManager& e) {
    state.SkipWithError(("extraction raised " + std::to_string(e.ec())).c_str());
  }
  std::error_code err;
  const auto outBytes = static_cast<std::int64_t>(fs::file_size(s.lineFile, err));
  if (err) state.SkipWithError("no line file");
  const std::string cat = "cat '" + s.level0 + "' > /dev/null";
  for (auto _ : state) {
    auto t0 = Clock::now();
    if (std::system(cat.c_str()) != 0) state.SkipWithError("cat failed");
    catSeconds += seconds_since(t0);
    t0 = Clock::now();
    if (read_all(s.level0, buffer) <= 0) state.SkipWithError("read failed");
    readSeconds += seconds_since(t0);
    if (fresh) fs::remove(s.lineFile);
    t0 = Clock::now();
    if (!write_all(s.lineFile, outBytes, buffer)) state.SkipWithError("write failed");
    writeSeconds += seconds_since(t0);
    if (fresh) fs::remove(s.lineFile);
    t0 = Clock::now();
    try {
      if (extract(s, channels) != 0) state.SkipWithError("extraction failed");
    } catch (const sar::base::CErrorExceptionManager& e) {
      state.SkipWithError(("extraction raised " + std::to_string(e.ec())).c_str());
    }
    const double t = seconds_since(t0);
    extractSeconds += t;
    state.SetIterationTime(t);
    if (!channels.empty()) outLines += channels[0].lines;
  }
  state.counters["lines_per_s"] = benchmark::Counter(static_cast<double>(outLines) / extractSeconds);
  state.counters["ratio_to_cat"] = extractSeconds / catSeconds;
  state.counters["ratio_to_read"] = extractSeconds / readSeconds;
  state.counters["write_floor_ratio"] = extractSeconds / (readSeconds + writeSeconds);
  state.counters["simulated"] = s.simulated ? 1 : 0;
  state.counters["fresh"] = fresh ? 1 : 0;
}

void sizes(benchmark::internal::Benchmark* b) {
  for (int fresh : {0, 1}) {
    b->Args({4096, fresh});
    if (std::getenv("SAR_BENCH_FULL")) b->Args({30000, fresh});
  }
  b->ArgNames({"lines", "fresh"})->UseManualTime()->Unit(benchmark::kMillisecond)->Iterations(3);
}

BENCHMARK(BM_ExtractIm)->Apply(sizes);

}  // namespace

BENCHMARK_MAIN();

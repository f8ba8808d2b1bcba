// Stripmap multilook of a full-size IM SLC (30000 lines x 5616 samples by default; set
// SAR_BENCH_ML_LINES / SAR_BENCH_ML_SAMPLES for other sizes): wall time of the detected looks
// in slant range (5 x 1, the looks an IM scene suggests, and 4 x 2) and the process's peak
// resident memory. The SLC is white clutter written once into SAR_BENCH_ML_DIR (default /tmp).
#include <benchmark/benchmark.h>
#include <sys/resource.h>
#include <unistd.h>

#include <complex>
#include <cstdlib>
#include <filesystem>
#include <random>
#include <string>
#include <vector>

#include "base/convert.hpp"
#include "base/profile.hpp"
#include "io/data_file.hpp"
#include "multilook/strip_multilook.hpp"

namespace {

int env_int(const char* name, int fallback) {
  const char* v = std::getenv(name);
  return v ? std::atoi(v) : fallback;
}

std::string make_slc() {
  static std::string slc;
  if (!slc.empty()) return slc;
  const int lines = env_int("SAR_BENCH_ML_LINES", 30000), samples = env_int("SAR_BENCH_ML_SAMPLES", 5616);
  const char* dir = std::getenv("SAR_BENCH_ML_DIR");
  const std::filesystem::path d = std::filesystem::path(dir ? dir : "/tmp") / ("sar_bench_ml_" + std::to_string(::getpid()));
  std::filesystem::create_directories(d);
  slc = (d / "scene_slc").string();
  sar::io::DataFile f(slc);
  f.lines = lines;
  f.pixels = samples;
  f.cellType = sar::io::kFloatComplex;
  f.open(1);
  std::mt19937 rng(1);
  std::normal_distribution<float> n(0.0f, 0.7f);
  std::vector<std::complex<float>> row(static_cast<std::size_t>(samples));
  for (int l = 0; l < lines; ++l) {
    for (auto& v : row) v = {n(rng), n(rng)};
    sar::io::BufferIO w(&f, 0, samples, l, 1, sar::io::kFloatComplex);
    w.writebuffer(row.data());
  }
  f.close();
  f.write_hdr();
  const std::string a = slc + "_hdr";
  std::string text;
  sar::base::sec852myascii(7.0e8, text);
  sar::base::WriteMyProfileStringQuote("Processing", "AzimuthStartTime", text, a);
  sar::base::WriteMyProfileDouble("Processing", "AzimuthTimeStep", 1.0 / 1652.0, a);
  const double nearTime = 5.5e-3, fs = 19.20768e6, carrier = 5.331e9;
  sar::base::WriteProfileDoubleArray("Processing", "FastTime", {&nearTime, 1}, a);
  sar::base::WriteMyProfileDouble("Processing", "PixelSpacingRg", 7.8, a);
  sar::base::WriteMyProfileDouble("Processing", "PixelSpacingAz", 4.05, a);
  sar::base::WriteProfileDoubleArray("ChannelInfo", "SamplingRate", {&fs, 1}, a);
  sar::base::WriteProfileDoubleArray("ChannelInfo", "CarrierFrequency", {&carrier, 1}, a);
  sar::base::SyncProfile(a);
  sar::base::FreeProfile(a);
  return slc;
}

void BM_StripMultilook(benchmark::State& state) {
  const std::string slc = make_slc();
  sar::multilook::StripMultilookRequest req;
  req.slc = slc;
  req.output = slc.substr(0, slc.size() - 4) + "_pwr";
  req.azimuthLooks = static_cast<int>(state.range(0));
  req.rangeLooks = static_cast<int>(state.range(1));
  for (auto _ : state) {
    sar::multilook::StripMultilookResult res;
    if (sar::multilook::run_strip_multilook(req, res) != 0) state.SkipWithError(res.error.c_str());
  }
  rusage u{};
  ::getrusage(RUSAGE_SELF, &u);
  state.counters["peak_MiB"] = static_cast<double>(u.ru_maxrss) / 1024.0;
}
BENCHMARK(BM_StripMultilook)->Args({5, 1})->Args({4, 2})->Unit(benchmark::kSecond)->Iterations(1);

}  // namespace

int main(int argc, char** argv) {
  benchmark::Initialize(&argc, argv);
  benchmark::RunSpecifiedBenchmarks();
  benchmark::Shutdown();
  std::error_code ec;
  if (!make_slc().empty()) std::filesystem::remove_all(std::filesystem::path(make_slc()).parent_path(), ec);
  return 0;
}

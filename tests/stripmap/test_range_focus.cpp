// Range compression against a direct correlation, the two storage modes, window alignment,
// the quadrature repair and the refusals of bad sizes.
#include <gtest/gtest.h>
#include <omp.h>

#include <cmath>
#include <complex>
#include <cstdio>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <memory>
#include <random>
#include <string>
#include <vector>

#include "base/errors.hpp"
#include "io/line_store.hpp"
#include "stripmap/range_focus.hpp"

namespace fs = std::filesystem;
using sar::stripmap::procparm;
using sar::stripmap::sarpar;
using cf = std::complex<float>;

namespace {

constexpr double kFs = 19.20768e6;
constexpr double kBandwidth = 16e6;
constexpr double kPi = 3.14159265358979323846;

// A down-sampled chirp of n samples, the shape of the range reference.
std::vector<cf> chirp(int n) {
  std::vector<cf> r(static_cast<std::size_t>(n));
  const double tp = n / kFs, k = kBandwidth / tp;
  for (int i = 0; i < n; ++i) {
    const double t = i / kFs - tp / 2;
    r[static_cast<std::size_t>(i)] = std::polar(1.0f, static_cast<float>(kPi * k * t * t));
  }
  return r;
}

struct Scene {
  fs::path dir;
  sarpar par;
  procparm proc;
  std::vector<std::vector<cf>> raw;  // per line, as written
  std::vector<int> shifts;           // per line, window start against the earliest
};

// Lines of `samples` raw samples holding the reference at absolute sample `target` (counted
// from the earliest window start) plus weak noise; lines at or after `changeLine` start
// `changeBy` samples later.
Scene make_scene(const std::string& name, int lines, int samples, int replica, int target, int changeLine,
                 int changeBy, unsigned seed = 7) {
  Scene s;
  s.dir = fs::path(testing::TempDir()) / ("rangefoc_" + name);
  fs::remove_all(s.dir);
  fs::create_directories(s.dir);
  s.par.samples = samples;
  s.par.lines = lines;
  s.par.samplingRate = kFs;
  s.par.prf = 1652.0;
  s.par.nearRangeTime = 5.5e-3;
  s.par.far_range_time = s.par.nearRangeTime + std::max(0, changeBy) / kFs;
  s.par.extrPath = (s.dir / "EXTR").string();
  s.par.rgfPath = (s.dir / "EXTR.rgf").string();
  s.par.slcPath = (s.dir / "SLC").string();
  s.proc.replica = chirp(replica);
  s.proc.replicaLength = replica;
  s.proc.Flag_swstal = 1;
  s.proc.Azblk = std::min(8, lines);
  const auto ref = s.proc.replica;
  std::mt19937 rng(seed);
  std::normal_distribution<float> noise(0.0f, 0.05f);
  std::ofstream out(s.par.extrPath, std::ios::binary);
  for (int l = 0; l < lines; ++l) {
    const int shift = l >= changeLine ? changeBy : 0;
    std::vector<cf> line(static_cast<std::size_t>(samples));
    for (auto& v : line) v = {noise(rng), noise(rng)};
    const int at = target - shift + (l % 3);  // the target walks a little from line to line
    for (int i = 0; i < replica; ++i)
      if (at + i >= 0 && at + i < samples) line[static_cast<std::size_t>(at + i)] += ref[static_cast<std::size_t>(i)];
    const auto time = static_cast<float>(s.par.nearRangeTime + shift / kFs);
    out.write(reinterpret_cast<const char*>(&time), 4);
    out.write(reinterpret_cast<const char*>(line.data()), static_cast<std::streamsize>(line.size() * sizeof(cf)));
    s.raw.push_back(std::move(line));
    s.shifts.push_back(shift);
  }
  return s;
}

std::vector<cf> read_all(const std::string& path) {
  std::ifstream in(path, std::ios::binary);
  std::vector<cf> v(fs::file_size(path) / sizeof(cf));
  in.read(reinterpret_cast<char*>(v.data()), static_cast<std::streamsize>(v.size() * sizeof(cf)));
  return v;
}

// Valid lags of the correlation of a line with the reference, in double precision.
std::vector<std::complex<double>> correlate(const std::vector<cf>& x, const std::vector<cf>& r) {
  const std::size_t v = x.size() - r.size() + 1;
  std::vector<std::complex<double>> y(v);
  for (std::size_t k = 0; k < v; ++k) {
    std::complex<double> acc;
    for (std::size_t n = 0; n < r.size(); ++n)
      acc += std::complex<double>(x[k + n]) * std::conj(std::complex<double>(r[n]));
    y[k] = acc;
  }
  return y;
}

std::vector<cf> run_file_mode(Scene& s) {
  EXPECT_EQ(sar::stripmap::rangefoc(s.par, s.proc), 0);
  return read_all(s.par.rgfPath);
}

std::vector<cf> run_core_mode(Scene& s) {
  s.proc.Flag_incore = 1;
  EXPECT_EQ(sar::stripmap::init_buffer(s.par, s.proc), 0);
  EXPECT_EQ(sar::stripmap::rangefoc(s.par, s.proc), 0);
  s.proc.Flag_incore = 0;
  return {s.proc.matrix.begin(), s.proc.matrix.end()};
}

// The line file's bytes handed over in memory, as the extraction does in core mode, in chunks
// of `chunkLines` lines; the file itself is removed so that reading it would fail.
std::shared_ptr<sar::io::LineStore> store_of(const Scene& s, std::size_t chunkLines, int lines) {
  const std::size_t lineBytes = 4 + 8 * static_cast<std::size_t>(s.par.samples);
  auto store = std::make_shared<sar::io::LineStore>(lineBytes, chunkLines * lineBytes);
  std::ifstream in(s.par.extrPath, std::ios::binary);
  std::vector<char> line(lineBytes);
  for (int l = 0; l < lines && in.read(line.data(), static_cast<std::streamsize>(lineBytes)); ++l)
    store->append(line.data(), lineBytes);
  in.close();
  fs::remove(s.par.extrPath);
  return store;
}

}  // namespace

TEST(RangeFocus, MatchesDirectCorrelationWithAlignedWindows) {
  Scene s = make_scene("direct", 21, 300, 61, 120, 11, 9);
  const auto out = run_file_mode(s);
  const int valid = 300 - 61 + 1, width = valid + 9;
  ASSERT_EQ(s.proc.rangeSamples, width);
  ASSERT_EQ(out.size(), static_cast<std::size_t>(21 * width));
  double worst = 0.0, peak = 0.0;
  for (int l = 0; l < 21; ++l) {
    const auto ref = correlate(s.raw[static_cast<std::size_t>(l)], s.proc.replica);
    const int sh = s.shifts[static_cast<std::size_t>(l)];
    for (int k = 0; k < width; ++k) {
      const cf got = out[static_cast<std::size_t>(l * width + k)];
      const std::complex<double> want = (k >= sh && k < sh + valid) ? ref[static_cast<std::size_t>(k - sh)] : 0.0;
      worst = std::max(worst, std::abs(std::complex<double>(got) - want));
      peak = std::max(peak, std::abs(want));
    }
    // The target sits at one slant range whatever the window start of its line.
    int best = 0;
    for (int k = 1; k < width; ++k)
      if (std::abs(out[static_cast<std::size_t>(l * width + k)]) > std::abs(out[static_cast<std::size_t>(l * width + best)]))
        best = k;
    EXPECT_EQ(best, 120 + l % 3) << "line " << l;
  }
  EXPECT_LT(worst, 1e-5 * peak);
}

TEST(RangeFocus, UnitReplicaPassesLinesThrough) {
  Scene s = make_scene("unit", 5, 64, 1, 10, 99, 0);
  s.proc.replica = {cf(1.0f, 0.0f)};
  const auto out = run_file_mode(s);
  ASSERT_EQ(s.proc.rangeSamples, 64);
  for (int l = 0; l < 5; ++l)
    for (int k = 0; k < 64; ++k)
      EXPECT_NEAR(std::abs(out[static_cast<std::size_t>(l * 64 + k)] - s.raw[static_cast<std::size_t>(l)][static_cast<std::size_t>(k)]),
                  0.0, 1e-5);
}

// Core mode must give the file mode's samples bit for bit, for block sizes that leave a
// remainder, divide the lines exactly, and with the quadrature repair on.
TEST(RangeFocus, CoreModeEqualsFileModeBitForBit) {
  struct Case {
    int azblk, ortog, swstal;
  };
  for (const Case c : {Case{8, 0, 1}, Case{7, 0, 1}, Case{20, 1, 1}, Case{3, 0, 0}}) {
    SCOPED_TRACE(testing::Message() << "Azblk " << c.azblk << " ortog " << c.ortog << " swstal " << c.swstal);
    Scene s = make_scene("modes", 21, 256, 41, 90, 13, 5);
    s.proc.Azblk = c.azblk;
    s.proc.Flag_ortog = c.ortog;
    s.proc.Flag_swstal = c.swstal;
    const auto file = run_file_mode(s);
    Scene t = make_scene("modes", 21, 256, 41, 90, 13, 5);
    t.proc.Flag_ortog = c.ortog;
    t.proc.Flag_swstal = c.swstal;
    const auto core = run_core_mode(t);
    ASSERT_EQ(file.size(), core.size());
    // With the repair on, its averages run over the whole matrix in core mode and block after
    // block in file mode: the same lines in the same order.
    EXPECT_EQ(0, std::memcmp(file.data(), core.data(), file.size() * sizeof(cf)));
    EXPECT_EQ(t.proc.Azblk, 21);
  }
}

// Without alignment the window widening stays (zeros at the right) and no line moves; a time
// prefix read as anything but a float would show up as shifted or garbled lines.
TEST(RangeFocus, NoAlignmentKeepsWidthAndPlace) {
  Scene s = make_scene("noalign", 6, 128, 17, 40, 3, 6);
  s.proc.Flag_swstal = 0;
  const auto out = run_core_mode(s);
  const int valid = 128 - 17 + 1, width = valid + 6;
  ASSERT_EQ(s.proc.rangeSamples, width);
  for (int l = 0; l < 6; ++l) {
    const auto ref = correlate(s.raw[static_cast<std::size_t>(l)], s.proc.replica);
    for (int k = 0; k < valid; ++k)
      ASSERT_NEAR(std::abs(std::complex<double>(out[static_cast<std::size_t>(l * width + k)]) - ref[static_cast<std::size_t>(k)]),
                  0.0, 1e-3)
          << "line " << l << " lag " << k;
    for (int k = valid; k < width; ++k) EXPECT_EQ(out[static_cast<std::size_t>(l * width + k)], cf{});
  }
}

TEST(RangeFocus, RefusesBadSizesAndWindows) {
  {
    Scene s = make_scene("long_replica", 4, 32, 16, 4, 99, 0);
    s.proc.replica = chirp(33);
    s.proc.replicaLength = 33;
    EXPECT_EQ(sar::stripmap::rangefoc(s.par, s.proc), 10);
    EXPECT_FALSE(fs::exists(s.par.rgfPath));
  }
  for (int azblk : {0, -3, 5}) {
    Scene s = make_scene("azblk", 4, 64, 9, 4, 99, 0);
    s.proc.Azblk = azblk;
    EXPECT_EQ(sar::stripmap::rangefoc(s.par, s.proc), 10) << azblk;
  }
  {
    // A line whose window starts beyond the product's farthest start.
    Scene s = make_scene("jump", 6, 64, 9, 10, 3, 4);
    s.par.far_range_time = s.par.nearRangeTime + 2 / kFs;
    EXPECT_EQ(sar::stripmap::rangefoc(s.par, s.proc), 10);
    EXPECT_FALSE(fs::exists(s.par.rgfPath));
    EXPECT_FALSE(fs::exists(s.par.rgfPath + ".part"));
  }
  {
    Scene s = make_scene("truncated", 6, 64, 9, 10, 99, 0);
    fs::resize_file(s.par.extrPath, fs::file_size(s.par.extrPath) - 10);
    try {
      sar::stripmap::rangefoc(s.par, s.proc);
      ADD_FAILURE() << "a short raw file was accepted";
    } catch (const sar::base::CErrorExceptionManager& e) {
      EXPECT_EQ(e.ec(), sar::base::ec::kFileIo);
    }
    EXPECT_FALSE(fs::exists(s.par.rgfPath));
    EXPECT_FALSE(fs::exists(s.par.rgfPath + ".part"));
  }
}

TEST(RangeFocus, DestBufferWritesWholeFileOnly) {
  Scene s = make_scene("dest", 4, 64, 9, 10, 99, 0);
  s.proc.Flag_incore = 1;
  ASSERT_EQ(sar::stripmap::init_buffer(s.par, s.proc), 0);
  ASSERT_EQ(sar::stripmap::rangefoc(s.par, s.proc), 0);
  s.proc.focusedLines = 3;
  s.proc.focusedSamples = 50;
  ASSERT_EQ(sar::stripmap::dest_buffer(s.par, s.proc), 0);
  EXPECT_EQ(fs::file_size(s.par.slcPath), 3u * 50u * sizeof(cf));
  EXPECT_TRUE(s.proc.matrix.empty());
  EXPECT_EQ(sar::stripmap::dest_buffer(s.par, s.proc), 10);  // nothing left to write
}

// Quadrature imbalance of a receiver (Q gain 1.1, 3 degrees between the channels, DC offsets)
// on a tone: after the repair the mirror tone must fall 30 dB below the tone.
TEST(Ortog, RemovesQuadratureImbalance) {
  const int n = 1024, lines = 12;
  const double f = 0.137, gain = 1.1, angle = 3.0 * kPi / 180.0;
  std::vector<cf> m(static_cast<std::size_t>(n * lines));
  std::mt19937 rng(3);
  std::uniform_real_distribution<double> ph(0.0, 2 * kPi);
  for (int l = 0; l < lines; ++l) {
    const double p0 = ph(rng);
    for (int k = 0; k < n; ++k) {
      const double p = 2 * kPi * f * k + p0;
      m[static_cast<std::size_t>(l * n + k)] = {static_cast<float>(std::cos(p) + 0.2),
                                                static_cast<float>(gain * std::sin(p + angle) - 0.3)};
    }
  }
  auto mirror_db = [&](int l) {
    std::complex<double> pos, neg;
    for (int k = 0; k < n; ++k) {
      const std::complex<double> x(m[static_cast<std::size_t>(l * n + k)]);
      pos += x * std::polar(1.0, -2 * kPi * f * k);
      neg += x * std::polar(1.0, 2 * kPi * f * k);
    }
    return 20 * std::log10(std::abs(neg) / std::abs(pos));
  };
  EXPECT_GT(mirror_db(5), -30.0);  // the imbalance is visible before
  ASSERT_EQ(sar::stripmap::ortogN(m, n, n, lines, 0), 0);
  for (int l = 2; l < lines; ++l) EXPECT_LT(mirror_db(l), -30.0) << "line " << l;
}

TEST(Ortog, ZeroLinesPassAndBalancedChannelsStay) {
  const int n = 256;
  std::vector<cf> m(static_cast<std::size_t>(3 * n));
  for (int k = 0; k < n; ++k) {
    const double p = 2 * kPi * 8 * k / n;  // whole cycles: no DC in either channel
    m[static_cast<std::size_t>(k)] = {static_cast<float>(std::cos(p)), static_cast<float>(std::sin(p))};
    m[static_cast<std::size_t>(2 * n + k)] = {static_cast<float>(std::cos(p + 1)), static_cast<float>(std::sin(p + 1))};
  }
  const auto before = m;
  ASSERT_EQ(sar::stripmap::ortogN(m, n, n, 3, 0), 0);
  for (int k = 0; k < n; ++k) {
    EXPECT_EQ(m[static_cast<std::size_t>(n + k)], cf{});
    for (int l : {0, 2})
      EXPECT_NEAR(std::abs(m[static_cast<std::size_t>(l * n + k)] - before[static_cast<std::size_t>(l * n + k)]), 0.0, 2e-3);
  }
}

TEST(ImCutter, AcceptsInsideAndRefusesBeyondTheRawLines) {
  sarpar par;
  par.samplingRate = kFs;
  par.prf = 1652.0;
  par.nearRangeTime = 5.5e-3;
  par.azimuthStartTime = 1000.0;
  par.lines = 4000;
  par.samples = 5000;
  procparm proc;
  proc.replicaLength = 500;
  sar::stripmap::azimuthconf az;
  az.RangeOverlap = 16;
  az.AzimuthOverlap = 64;
  sar::stripmap::cutrect wanted{1000.0 + 100 / 1652.0, 5.5e-3 + 20 / kFs, 3000, 4000}, needed, back;
  ASSERT_EQ(sar::stripmap::imcutter(par, proc, az, wanted, needed), 0);
  EXPECT_EQ(needed.lines, 3000 + 128);
  EXPECT_EQ(needed.samples, 4000 + 500 + 32 - 1);
  sar::stripmap::imcutter_inv(par, proc, az, needed, back);
  EXPECT_NEAR(back.azimuthStart, wanted.azimuthStart, 1e-9);
  EXPECT_NEAR(back.rangeStart, wanted.rangeStart, 1e-15);
  EXPECT_EQ(back.lines, wanted.lines);
  EXPECT_EQ(back.samples, wanted.samples);
  wanted.lines = 3900;  // past the last raw line with the overlaps
  EXPECT_EQ(sar::stripmap::imcutter(par, proc, az, wanted, needed), 10);
  wanted.lines = 3000;
  wanted.samples = 4600;
  EXPECT_EQ(sar::stripmap::imcutter(par, proc, az, wanted, needed), 10);
}

// Lines handed over in memory give the file's samples bit for bit, whatever the chunks of the
// store; a store that holds fewer lines than the product is refused, not read past.
TEST(RangeFocus, LinesFromMemoryEqualFileModeBitForBit) {
  for (const std::size_t chunkLines : {std::size_t{1}, std::size_t{7}, std::size_t{1000}}) {
    SCOPED_TRACE(testing::Message() << chunkLines << " lines a chunk");
    Scene s = make_scene("memfile", 40, 256, 41, 90, 13, 5);
    s.proc.Flag_ortog = 1;
    const auto file = run_file_mode(s);
    Scene t = make_scene("memstore", 40, 256, 41, 90, 13, 5);
    t.proc.Flag_ortog = 1;
    t.proc.rawLines = store_of(t, chunkLines, 40);
    const auto core = run_core_mode(t);
    EXPECT_FALSE(t.proc.rawLines);  // the store is let go once read
    ASSERT_EQ(file.size(), core.size());
    EXPECT_EQ(0, std::memcmp(file.data(), core.data(), file.size() * sizeof(cf)));
  }
  Scene u = make_scene("memshort", 12, 128, 17, 40, 3, 2);
  u.proc.rawLines = store_of(u, 4, 11);
  EXPECT_EQ(sar::stripmap::init_buffer(u.par, u.proc), 10);
  EXPECT_TRUE(u.proc.matrix.empty());
}

// A long matrix of short lines: past its first few windows core mode transforms each group of
// rows aside and writes it straight at the output pitch, where file mode (blocks of Azblk lines)
// transforms in place and repacks. Both give the same bytes, on one thread and on two.
TEST(RangeFocus, LongMatrixRowsPlacedDirectlyEqualFileMode) {
  Scene s = make_scene("longfile", 2600, 64, 17, 20, 1300, 5);
  s.proc.Azblk = 1000;
  s.proc.Flag_ortog = 1;
  const auto file = run_file_mode(s);
  for (const int threads : {1, 2}) {
    SCOPED_TRACE(testing::Message() << threads << " threads");
    omp_set_num_threads(threads);
    Scene t = make_scene("longcore", 2600, 64, 17, 20, 1300, 5);
    t.proc.Flag_ortog = 1;
    const auto core = run_core_mode(t);
    ASSERT_EQ(file.size(), core.size());
    EXPECT_EQ(0, std::memcmp(file.data(), core.data(), file.size() * sizeof(cf)));
  }
  omp_set_num_threads(omp_get_num_procs());
}

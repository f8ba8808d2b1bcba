#include <gtest/gtest.h>

#include <algorithm>
#include <cstring>
#include <set>
#include <stdexcept>
#include <string>

#include "dft_reference.hpp"
#include "dsp/detail/transpose.hpp"
#include "dsp/fft.hpp"

namespace sar::dsp {
namespace {

// The engine's planning effort changes no result; the suite plans quickly and leaves
// measured planning to the tests that name it.
class QuickPlanning : public ::testing::Environment {
 public:
  void SetUp() override { set_fft_planning(FftPlanning::Estimate); }
};
[[maybe_unused]] const auto* const kQuickPlanning = ::testing::AddGlobalTestEnvironment(new QuickPlanning);

using testing::cd;
using testing::direct_dft;
using testing::random_samples;
using testing::relative_error;

// Float FFTs of these sizes have a relative RMS error of a few 1e-7; a wrong sign, scale,
// stride or index is an O(1) error.
constexpr double kTol = 1e-5;

// 1, the primes 2, 3, 5, mixed 2-3-5 lengths, a genpow result, odd lengths (one prime, one
// not 2-3-5 smooth) and a power of two.
const int kLengths[] = {1, 2, 3, 5, 12, 45, 60, 97, 231, 256, 1000};

int sign_of(int code) { return code == 1 ? -1 : 1; }
double scale_of(int code, int L) { return code == -1 ? 1.0 / L : 1.0; }

bool bit_equal(fcomplex a, fcomplex b) { return std::memcmp(&a, &b, sizeof a) == 0; }

struct DirLen {
  int code;
  int length;
};

void PrintTo(const DirLen& d, std::ostream* os) { *os << "code " << d.code << " length " << d.length; }

std::vector<DirLen> dir_len_table() {
  std::vector<DirLen> t;
  for (int code : {1, -1, -2})
    for (int L : kLengths) t.push_back({code, L});
  return t;
}

class FftAgainstDft : public ::testing::TestWithParam<DirLen> {};

// Rows: a batch of 4 of 5 rows, rows padded to pitch L + 3. Padding and the fifth row must
// come out untouched.
TEST_P(FftAgainstDft, RowStageWithPitchAndBatch) {
  const auto [code, L] = GetParam();
  const int pitch = L + 3, rows = 5, count = 4;
  cvector buf = random_samples(static_cast<std::size_t>(pitch * rows), 11u + L);
  const cvector orig = buf;
  ASSERT_EQ(fft_c(pitch, L, rows, count, code, 0, buf), 0);
  for (int r = 0; r < rows; ++r) {
    std::vector<cd> x(L), got(L);
    for (int i = 0; i < L; ++i) {
      x[i] = cd(orig[r * pitch + i]);
      got[i] = cd(buf[r * pitch + i]);
    }
    if (r < count) {
      auto ref = L == 1 ? x : direct_dft(x, sign_of(code));
      if (L > 1)
        for (auto& v : ref) v *= scale_of(code, L);
      EXPECT_LT(relative_error(got, ref), kTol) << "row " << r;
    }
    for (int i = (r < count ? L : 0); i < pitch; ++i)
      ASSERT_TRUE(bit_equal(buf[r * pitch + i], orig[r * pitch + i])) << "row " << r << " sample " << i;
  }
}

// Columns: columns of L samples (count = L rows of a matrix with one spare row), 3 of the 5
// samples of each row transformed.
TEST_P(FftAgainstDft, ColumnStageWithStride) {
  const auto [code, L] = GetParam();
  const int pitch = 5, length = 3, rows = L + 1, count = L;
  cvector buf = random_samples(static_cast<std::size_t>(pitch * rows), 29u + L);
  const cvector orig = buf;
  ASSERT_EQ(fft_c(pitch, length, rows, count, 0, code, buf), 0);
  for (int c = 0; c < pitch; ++c) {
    std::vector<cd> x(L), got(L);
    for (int r = 0; r < L; ++r) {
      x[r] = cd(orig[r * pitch + c]);
      got[r] = cd(buf[r * pitch + c]);
    }
    if (c < length) {
      auto ref = L == 1 ? x : direct_dft(x, sign_of(code));
      if (L > 1)
        for (auto& v : ref) v *= scale_of(code, L);
      EXPECT_LT(relative_error(got, ref), kTol) << "column " << c;
    } else {
      for (int r = 0; r < L; ++r) ASSERT_TRUE(bit_equal(buf[r * pitch + c], orig[r * pitch + c]));
    }
  }
  for (int c = 0; c < pitch; ++c) ASSERT_TRUE(bit_equal(buf[L * pitch + c], orig[L * pitch + c]));
}

INSTANTIATE_TEST_SUITE_P(Lengths, FftAgainstDft, ::testing::ValuesIn(dir_len_table()),
                         [](const auto& info) {
                           const int c = info.param.code;
                           return std::string(c == 1 ? "fwd" : c == -1 ? "bwd" : "bwdUnscaled") + "_" +
                                  std::to_string(info.param.length);
                         });

class FftIdentities : public ::testing::TestWithParam<int> {};

// Identities that hold whatever the engine: forward then code -1 is the identity (in place
// and out of place), Parseval, and code -2 is code -1 times L.
TEST_P(FftIdentities, RoundTripParsevalAndScale) {
  const int L = GetParam();
  const int rows = 3;
  const cvector x = random_samples(static_cast<std::size_t>(L * rows), 5u + L);
  cvector X(x.size()), back(x.size()), unscaled(x.size());
  ASSERT_EQ(fft_c(L, L, rows, rows, 1, 0, x, X), 0);
  ASSERT_EQ(fft_c(L, L, rows, rows, -1, 0, X, back), 0);
  unscaled = X;
  ASSERT_EQ(fft_c(L, L, rows, rows, -2, 0, unscaled), 0);
  cvector inplace = x;
  ASSERT_EQ(fft_c(L, L, rows, rows, 1, 0, inplace), 0);
  ASSERT_EQ(fft_c(L, L, rows, rows, -1, 0, inplace), 0);

  std::vector<cd> xs(x.begin(), x.end()), bs(back.begin(), back.end()), is(inplace.begin(), inplace.end());
  EXPECT_LT(relative_error(bs, xs), kTol);
  EXPECT_LT(relative_error(is, xs), kTol);
  double ex = 0, eX = 0;
  for (std::size_t i = 0; i < x.size(); ++i) {
    ex += std::norm(cd(x[i]));
    eX += std::norm(cd(X[i]));
  }
  EXPECT_NEAR(eX / (L * ex), 1.0, kTol);
  std::vector<cd> u(unscaled.begin(), unscaled.end()), scaledUp(back.size());
  for (std::size_t i = 0; i < back.size(); ++i) scaledUp[i] = cd(back[i]) * static_cast<double>(L);
  EXPECT_LT(relative_error(u, scaledUp), kTol);

  // A gain rides on the normalisation of a row and of a column stage.
  for (const bool columns : {false, true}) {
    fft_plan plan;
    ASSERT_EQ(columns ? fft_makep_c(plan, rows, rows, L, L, 0, -1, 1) : fft_makep_c(plan, L, L, rows, rows, -1, 0, 1), 0);
    cvector plain = X, gained = X;
    pfft_c(plan, plain);
    pfft_c(plan, gained, -2.5);
    std::vector<cd> g(gained.begin(), gained.end()), want(plain.size());
    for (std::size_t i = 0; i < plain.size(); ++i) want[i] = cd(plain[i]) * -2.5;
    EXPECT_LT(relative_error(g, want), kTol) << (columns ? "columns" : "rows");
  }
}

INSTANTIATE_TEST_SUITE_P(Lengths, FftIdentities, ::testing::Values(2, 3, 5, 12, 45, 97, 256, 1000, 4096));

// Two-dimensional transforms against a direct 2-D sum, with the combined 1/(rows cols).
TEST(Fft2D, BothStagesAgainstDirectSum) {
  struct Case {
    int rowsT, cols, rowCode, colCode;
  };
  for (const Case c : {Case{6, 10, 1, 1}, Case{15, 8, -1, -1}, Case{9, 5, 1, -2}, Case{4, 12, -2, -1}}) {
    const int pitch = c.cols + 2, rows = c.rowsT + 1;
    cvector buf = random_samples(static_cast<std::size_t>(pitch * rows), 3u + c.cols);
    const cvector orig = buf;
    const cvector input = orig;
    cvector out(buf.size(), fcomplex{7.0f, -7.0f});
    ASSERT_EQ(fft_c(pitch, c.cols, rows, c.rowsT, c.rowCode, c.colCode, input, out), 0);
    ASSERT_EQ(fft_c(pitch, c.cols, rows, c.rowsT, c.rowCode, c.colCode, buf), 0);
    const double scale = scale_of(c.rowCode, c.cols) * scale_of(c.colCode, c.rowsT);
    std::vector<cd> ref, gotIn, gotOut;
    for (int k = 0; k < c.rowsT; ++k)
      for (int l = 0; l < c.cols; ++l) {
        cd s = 0;
        for (int r = 0; r < c.rowsT; ++r)
          for (int m = 0; m < c.cols; ++m) {
            const double ang = 2 * std::numbers::pi *
                               (sign_of(c.colCode) * double(k * r % c.rowsT) / c.rowsT +
                                sign_of(c.rowCode) * double(l * m % c.cols) / c.cols);
            s += cd(orig[r * pitch + m]) * cd(std::cos(ang), std::sin(ang));
          }
        ref.push_back(s * scale);
        gotIn.push_back(cd(buf[k * pitch + l]));
        gotOut.push_back(cd(out[k * pitch + l]));
      }
    EXPECT_LT(relative_error(gotIn, ref), kTol) << c.rowsT << "x" << c.cols;
    EXPECT_LT(relative_error(gotOut, ref), kTol) << c.rowsT << "x" << c.cols;
    // Out of place: the input is kept and the output outside the region is not written.
    for (std::size_t i = 0; i < orig.size(); ++i) {
      ASSERT_TRUE(bit_equal(input[i], orig[i]));
      const int r = static_cast<int>(i) / pitch, m = static_cast<int>(i) % pitch;
      if (r >= c.rowsT || m >= c.cols) {
        ASSERT_TRUE(bit_equal(out[i], fcomplex{7.0f, -7.0f}));
      }
    }
  }
}

// Batches large enough to be cut into chunks (a full chunk and a remainder) and spread over
// two threads, with the normalisation applied chunk by chunk: rows and columns of 64 samples,
// an odd pitch, against the direct sum.
TEST(Fft, LargeBatchesAcrossChunksAndThreads) {
  const int saved = fft_threads();
  set_fft_threads(2);
  const int L = 64, many = 4120, pitch = many + 1;
  struct Case {
    bool columns;
    int code;
  };
  for (const Case c : {Case{false, -1}, Case{true, -1}, Case{true, 1}}) {
    const int rows = c.columns ? L : many;
    const int rowPitch = c.columns ? pitch : L + 1;
    const int length = c.columns ? many : L;
    cvector buf = random_samples(static_cast<std::size_t>(rowPitch) * rows, 21);
    const cvector orig = buf;
    ASSERT_EQ(fft_c(rowPitch, length, rows, rows, c.columns ? 0 : c.code, c.columns ? c.code : 0, buf), 0);
    double worst = 0;
    for (int t = 0; t < many; ++t) {
      std::vector<cd> x(L), got(L);
      for (int e = 0; e < L; ++e) {
        const std::size_t at = c.columns ? static_cast<std::size_t>(e) * rowPitch + t : static_cast<std::size_t>(t) * rowPitch + e;
        x[e] = cd(orig[at]);
        got[e] = cd(buf[at]);
      }
      auto ref = direct_dft(x, sign_of(c.code));
      for (auto& v : ref) v *= scale_of(c.code, L);
      worst = std::max(worst, relative_error(got, ref));
    }
    EXPECT_LT(worst, kTol) << (c.columns ? "columns" : "rows") << " code " << c.code;
  }
  set_fft_threads(saved);
}

TEST(Fft, LengthOneRowIsNeitherTransformedNorScaled) {
  cvector buf = random_samples(6, 1);
  const cvector orig = buf;
  ASSERT_EQ(fft_c(1, 1, 6, 6, -1, 0, buf), 0);
  for (std::size_t i = 0; i < buf.size(); ++i) EXPECT_TRUE(bit_equal(buf[i], orig[i]));
  fft_plan plan;
  ASSERT_EQ(fft_makep_c(plan, 1, 1, 6, 6, -1, 0, 1), 0);
  EXPECT_EQ(plan.rowStage, nullptr);
  EXPECT_EQ(plan.rowScale, 0);
}

// A buffer that does not start on the engine's preferred alignment still transforms right.
TEST(Fft, MisalignedBuffer) {
  const int L = 64;
  cvector store = random_samples(static_cast<std::size_t>(L + 1), 77);
  std::span<fcomplex> data = std::span<fcomplex>(store).subspan(1);
  std::vector<cd> x(data.begin(), data.end());
  ASSERT_EQ(fft_c(L, L, 1, 1, 1, 0, data), 0);
  std::vector<cd> got(data.begin(), data.end());
  EXPECT_LT(relative_error(got, direct_dft(x, -1)), kTol);
}

struct BadShape {
  int pitch, length, rows, count, rowCode, colCode, expected;
};

TEST(Fft, ErrorCodesLeaveBuffersAndPlansEmpty) {
  const BadShape table[] = {
      {0, 1, 1, 1, 1, 0, 1},   // pitch below 1
      {4, 4, 0, 1, 1, 0, 1},   // rows below 1
      {4, 5, 2, 2, 1, 0, 2},   // length above pitch
      {4, 4, 2, 3, 1, 0, 3},   // count above rows
      {4, 0, 2, 2, 1, 0, 4},   // row transforms of length 0
      {4, 4, 2, 0, -1, 0, 4},  // a batch of no rows
      {4, 4, 2, 2, 3, 0, 4},   // unknown row direction
      {4, 0, 3, 3, 0, 1, 5},   // no column to transform
      {4, 4, 3, 3, 0, 7, 5},   // unknown column direction
      {4, 4, 3, 3, 1, -3, 5},  // row stage fine, column stage refused
      {4, 4, 2, 2, 0, 0, 0},   // nothing to do is no error
  };
  for (const BadShape& b : table) {
    cvector buf = random_samples(16, 3);
    const cvector orig = buf;
    EXPECT_EQ(fft_c(b.pitch, b.length, b.rows, b.count, b.rowCode, b.colCode, buf), b.expected)
        << b.pitch << " " << b.length << " " << b.rows << " " << b.count;
    for (std::size_t i = 0; i < buf.size(); ++i) ASSERT_TRUE(bit_equal(buf[i], orig[i]));
    fft_plan plan;
    fft_makep_c(plan, b.pitch, b.length, b.rows, b.count, b.rowCode, b.colCode, 1);
    if (b.expected != 0) {
      EXPECT_EQ(plan.rowStage, nullptr);
      EXPECT_EQ(plan.colStage, nullptr);
    }
  }
}

TEST(Fft, ShortBufferThrowsWithBothSizes) {
  cvector buf(10);
  try {
    fft_c(8, 8, 2, 2, 1, 0, buf);
    FAIL() << "no exception";
  } catch (const std::length_error& e) {
    const std::string msg = e.what();
    EXPECT_NE(msg.find("10"), std::string::npos) << msg;
    EXPECT_NE(msg.find("16"), std::string::npos) << msg;
  }
  cvector big(32);
  EXPECT_THROW(fft_c(8, 8, 2, 2, 1, 0, std::span<const fcomplex>(big).subspan(0, 16),
                     std::span<fcomplex>(big).subspan(4, 16)),
               std::invalid_argument);
}

TEST(Fft, PlansAreMadeOnceAndReused) {
  set_fft_planning(FftPlanning::Measure);
  fft_plan a, b;
  ASSERT_EQ(fft_makep_c(a, 36, 36, 10, 10, 1, -1, 1), 0);
  const std::size_t after = fft_cached_plans();
  ASSERT_EQ(fft_makep_c(b, 36, 36, 10, 10, 1, -1, 1), 0);
  EXPECT_EQ(fft_cached_plans(), after);
  cvector buf = random_samples(360, 2);
  pfft_c(b, buf);
  EXPECT_EQ(fft_cached_plans(), after);
  // Clearing the cache does not invalidate a live plan.
  fft_clear_cache();
  cvector copy = buf;
  EXPECT_EQ(pfft_c(a, buf), 0);
  EXPECT_EQ(pfft_c(b, copy), 0);
  for (std::size_t i = 0; i < buf.size(); ++i) ASSERT_TRUE(bit_equal(buf[i], copy[i]));
  set_fft_planning(FftPlanning::Estimate);
}

// A transform's bytes depend on its samples and the alignment class of its first sample
// alone: not on the batch it runs in (a block of 300 lines in file mode, the whole scene in
// core mode), its place in that batch, or the thread count. The kit's buffers are 64-byte
// aligned; matrices whose rows are transformed keep a pitch of whole 64-byte units, so every
// row has the same class. Rows are checked against the transform alone, columns against the
// whole batch on one thread.
TEST(Fft, TransformBytesDoNotDependOnBatchPlaceOrThreads) {
  const int saved = fft_threads();
  struct Shape {
    bool columns;
    int length, code;
  };
  const Shape shapes[] = {{false, 1215, 1}, {false, 1536, -1}, {false, 5760, 1},
                          {true, 2048, 1},  {true, 1215, -1},  {false, 1 << 16, 1}};
  constexpr int kUnit = 8;  // samples in 64 bytes
  auto round_up = [](int n) { return (n + kUnit - 1) / kUnit * kUnit; };
  for (const Shape& s : shapes) {
    SCOPED_TRACE((s.columns ? "columns of " : "rows of ") + std::to_string(s.length));
    const int many = s.length >= (1 << 16) ? 4 : 40;  // transforms in the largest batch
    const cvector lines = random_samples(static_cast<std::size_t>(s.length) * many, 5);
    struct Batch {
      int count, offsetUnits, extraUnits, threads, first = 0;
    };
    const Batch reference{many, 0, 0, 1};
    // Transforms `count` of the lines in a matrix of the batch's layout and returns them.
    auto run = [&](Batch b) {
      b.first = std::min(b.first, many - 1);
      const int count = std::min(b.count, many - b.first);
      const int pitch = (s.columns ? round_up(count) : round_up(s.length)) + kUnit * b.extraUnits;
      const int rows = s.columns ? s.length : count;
      const std::size_t offset = static_cast<std::size_t>(kUnit) * b.offsetUnits;
      cvector store(static_cast<std::size_t>(pitch) * rows + offset, fcomplex{});
      std::span<fcomplex> m = std::span<fcomplex>(store).subspan(offset);
      auto at = [&](int t, int e) {
        return s.columns ? static_cast<std::size_t>(e) * pitch + t : static_cast<std::size_t>(t) * pitch + e;
      };
      for (int t = 0; t < count; ++t)
        for (int e = 0; e < s.length; ++e) m[at(t, e)] = lines[static_cast<std::size_t>(b.first + t) * s.length + e];
      set_fft_threads(b.threads);
      EXPECT_EQ(s.columns ? fft_c(pitch, count, rows, rows, 0, s.code, m) : fft_c(pitch, s.length, rows, rows, s.code, 0, m),
                0);
      std::vector<cvector> out(static_cast<std::size_t>(count), cvector(static_cast<std::size_t>(s.length)));
      for (int t = 0; t < count; ++t)
        for (int e = 0; e < s.length; ++e) out[static_cast<std::size_t>(t)][static_cast<std::size_t>(e)] = m[at(t, e)];
      return out;
    };
    std::vector<cvector> expected = run(reference);
    if (!s.columns) {
      for (int t = 0; t < many; ++t) expected[static_cast<std::size_t>(t)] = run({1, 0, 0, 1, t})[0];
    }
    for (const Batch b : {reference, Batch{many, 0, 0, 2}, Batch{many - 3, 1, 1, 2}, Batch{7, 3, 0, 2},
                          Batch{many / 2, 2, 3, 1, many / 2}, Batch{1, 1, 0, 2, 5}}) {
      SCOPED_TRACE(std::to_string(b.count) + " transforms, " + std::to_string(b.threads) + " threads");
      const std::vector<cvector> got = run(b);
      int differing = 0;
      for (std::size_t t = 0; t < got.size(); ++t) {
        const cvector& want = expected[t + static_cast<std::size_t>(std::min(b.first, many - 1))];
        if (std::memcmp(got[t].data(), want.data(), got[t].size() * sizeof(fcomplex)) != 0) ++differing;
      }
      EXPECT_EQ(differing, 0) << "transforms whose bytes differ";
    }
  }
  set_fft_threads(saved);
}

TEST(Fft, ShiftsOfEvenAndOddRows) {
  struct Case {
    std::vector<float> in, shifted, ishifted;
  };
  const Case table[] = {
      {{0}, {0}, {0}},
      {{0, 1, 2, 3}, {2, 3, 0, 1}, {2, 3, 0, 1}},
      {{0, 1, 2, 3, 4}, {3, 4, 0, 1, 2}, {2, 3, 4, 0, 1}},
      {{0, 1, 2, 3, 4, 5, 6}, {4, 5, 6, 0, 1, 2, 3}, {3, 4, 5, 6, 0, 1, 2}},
  };
  for (const Case& c : table) {
    const int n = static_cast<int>(c.in.size());
    cvector a(2 * n), b(2 * n);
    for (int r = 0; r < 2; ++r)
      for (int i = 0; i < n; ++i) a[r * n + i] = b[r * n + i] = {c.in[i] + 10 * r, 0};
    fftshift(a, n, 2);
    ifftshift(b, n, 2);
    for (int r = 0; r < 2; ++r)
      for (int i = 0; i < n; ++i) {
        EXPECT_EQ(a[r * n + i].real(), c.shifted[i] + 10 * r) << "n " << n;
        EXPECT_EQ(b[r * n + i].real(), c.ishifted[i] + 10 * r) << "n " << n;
      }
    ifftshift(a, n, 2);
    for (int r = 0; r < 2; ++r)
      for (int i = 0; i < n; ++i) EXPECT_EQ(a[r * n + i].real(), c.in[i] + 10 * r);
  }
  cvector small(3);
  EXPECT_THROW(fftshift(small, 2, 2), std::length_error);
}

TEST(Genpow, EdgeCases) {
  EXPECT_EQ(genpow(0, 1), 0);
  EXPECT_EQ(genpow(-7, 1), 0);
  EXPECT_EQ(genpow(1, 1), 1);
  EXPECT_EQ(genpow(7, 1), 8);
  EXPECT_EQ(genpow(5625, 1), 5760);
  EXPECT_EQ(genpow(5624, 1), 5760);
  EXPECT_EQ(genpow(8192, 1), 8192);
  EXPECT_EQ(genpow(2147483647, 1), 0);
}

// Against the 2^a 3^b 5^c numbers built from their exponents: the first one at or after n,
// never 5625.
TEST(Genpow, FirstSmoothNumberAtOrAfterN) {
  std::set<int> smooth;
  for (long p2 = 1; p2 <= 40000; p2 *= 2)
    for (long p3 = p2; p3 <= 40000; p3 *= 3)
      for (long p5 = p3; p5 <= 40000; p5 *= 5) smooth.insert(static_cast<int>(p5));
  smooth.erase(5625);
  for (int n = 1; n <= 30000; ++n) ASSERT_EQ(genpow(n, 1), *smooth.lower_bound(n)) << n;
}

TEST(FftMemory, AlignedAndZeroed) {
  void* p = fft_malloc(100);
  ASSERT_NE(p, nullptr);
  EXPECT_EQ(reinterpret_cast<std::uintptr_t>(p) % 64, 0u);
  fft_free(p);
  auto* z = static_cast<unsigned char*>(fft_calloc(33, 3));
  ASSERT_NE(z, nullptr);
  EXPECT_TRUE(std::all_of(z, z + 99, [](unsigned char c) { return c == 0; }));
  fft_free(z);
  EXPECT_EQ(fft_calloc(static_cast<std::size_t>(-1) / 2, 4), nullptr);
  fft_free(nullptr);
}

}  // namespace
}  // namespace sar::dsp

namespace sar::dsp {
namespace {

// The vector turns of the column transforms against their formula, on shapes whose rows and
// columns leave every kind of edge around the 4 x 4 tiles.
TEST(FftTurns, VectorGatherAndScatterMoveEverySample) {
  __builtin_cpu_init();
  if (!__builtin_cpu_supports("avx2") || !__builtin_cpu_supports("fma")) GTEST_SKIP() << "no AVX2 on this processor";
  for (const auto [n, count, stride] : {std::array<int, 3>{1, 1, 1}, {3, 5, 6}, {8, 8, 8}, {13, 7, 9}, {64, 33, 40},
                                        {37, 16, 2056}}) {
    const cvector src = random_samples(static_cast<std::size_t>(n) * stride, 3u + n);
    cvector t(static_cast<std::size_t>(n) * count, fcomplex{-9.0f, -9.0f});
    detail::gather_columns_avx2(src.data(), stride, n, count, t.data());
    for (int k = 0; k < count; ++k)
      for (int l = 0; l < n; ++l)
        ASSERT_EQ(t[static_cast<std::size_t>(k) * n + l], src[static_cast<std::size_t>(l) * stride + k])
            << n << " x " << count << " k " << k << " l " << l;
    cvector back(src.size(), fcomplex{-9.0f, -9.0f});
    detail::scatter_columns_avx2(t.data(), n, count, back.data(), stride);
    for (int l = 0; l < n; ++l)
      for (int k = 0; k < stride; ++k) {
        const std::size_t i = static_cast<std::size_t>(l) * stride + k;
        // Samples right of the columns are not the turn's to touch.
        ASSERT_EQ(back[i], k < count ? src[i] : fcomplex(-9.0f, -9.0f)) << n << " x " << count << " l " << l << " k " << k;
      }
  }
}

}  // namespace
}  // namespace sar::dsp

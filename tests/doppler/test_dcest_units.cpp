// The estimator's parts on constructed inputs.
#include <gtest/gtest.h>

#include <cmath>
#include <complex>
#include <cstring>
#include <numbers>
#include <vector>

#ifdef _OPENMP
#include <omp.h>
#endif

#include "doppler/dcest.hpp"
#include "dsp/fft.hpp"
#include "test_support.hpp"

namespace sar::doppler {
namespace {

constexpr double kTwoPi = 2.0 * std::numbers::pi;

// A grid of blocks with given centroids, as the block statistics would leave it.
dcestconf grid(int across, int rows, const std::vector<double>& centroids) {
  dcestconf c = testing::estimator_config();
  c.blocksAcross = across;
  c.blockRows = rows;
  c.gridBlocks = across * rows;
  c.blocks.resize(static_cast<std::size_t>(across * rows));
  for (int r = 0; r < rows; ++r)
    for (int k = 0; k < across; ++k) {
      dcblock& b = c.blocks[static_cast<std::size_t>(r * across + k)];
      b.sample = k * c.Blocks + c.Blocks / 2;
      b.line = r * c.Blockl + c.Blockl / 2;
      b.valid = 1;
      b.centroid = centroids.empty() ? 0.0 : centroids[static_cast<std::size_t>(r * across + k) % centroids.size()];
      b.power = 2.0;
      b.noise = 1.0;
      b.contrast = 2.0;
    }
  return c;
}

dcimage image_for(const dcestconf& c) {
  dcimage im;
  im.samples = c.blocksAcross * c.Blocks;
  im.lines = c.blockRows * c.Blockl;
  im.prf = 1652.4;
  im.platformSpeed = 7100.0;
  return im;
}

TEST(DopplerHistogram, ConstantInputHasOneBin) {
  std::vector<int> counts;
  double step = -1.0, minimum = 0.0;
  const std::vector<double> same(17, 2.5);
  make_hist(same, step, minimum, 1024, counts);
  EXPECT_EQ(step, 0.0);
  EXPECT_EQ(minimum, 2.5);
  EXPECT_EQ(counts[0], 17);
  double low = 0.0, high = 0.0;
  getpercentile(same, 0.25, low, high);
  EXPECT_EQ(low, 2.5);
  EXPECT_EQ(high, 2.5);
  const ambstats s = trimmed_stats(same, 0.5);
  EXPECT_EQ(s.mean, 2.5);
  EXPECT_EQ(s.std, 0.0);
  EXPECT_EQ(s.count, 17);
}

TEST(DopplerHistogram, PercentilesTrimWholeBinsFromBothEnds) {
  // 0..99: the minimum lies in bin 0, the maximum in bin 1023.
  std::vector<double> v;
  for (int i = 0; i < 100; ++i) v.push_back(i);
  double low = 0.0, high = 0.0;
  getpercentile(v, 0.0, low, high);
  // Nothing trimmed: the maximum is kept (a top edge two bins lower would drop 99).
  EXPECT_LT(low, 0.0);
  EXPECT_GT(high, 99.0);
  getpercentile(v, 0.1, low, high);
  int inside = 0;
  for (double x : v) inside += (x >= low && x <= high) ? 1 : 0;
  EXPECT_EQ(inside, 80);
  // Sums that meet keep everything.
  getpercentile(v, 0.6, low, high);
  EXPECT_EQ(low, 0.0);
  EXPECT_NEAR(high, 99.0, 1e-4);
}

TEST(DopplerHistogram, TrimmedStatisticsFindTheCoreAndAgreementNeedsAQuarter) {
  // A tight core at 2 with far outliers: trimming removes the outliers.
  std::vector<double> v = {2.0, 2.1, 1.9, 2.05, 1.95, 2.0, 2.02, 1.98, -30.0, 40.0};
  ambstats s = trimmed_stats(v, 0.3);
  EXPECT_NEAR(s.mean, 2.0, 0.05);
  EXPECT_LT(s.std, 0.3);
  EXPECT_TRUE(agreeing(s, 0.3));
  // Uniform noise: only the last trims bring the spread down, on too few values.
  std::vector<double> u;
  for (int i = 0; i < 40; ++i) u.push_back(-4.0 + 8.0 * ((i * 37) % 40) / 39.0);
  s = trimmed_stats(u, 0.3);
  EXPECT_LT(s.count, 10);
  EXPECT_FALSE(agreeing(s, 0.3));
  EXPECT_FALSE(agreeing(trimmed_stats(std::vector<double>{}, 0.3), 0.3));
}

TEST(DopplerBestBlocks, HighestCellsWithoutOverlapInsideTheMap) {
  // 12 x 8 map, blocks of 4 x 2 cells.
  std::vector<float> map(96, 1.0f);
  map[2 * 12 + 5] = 9.0f;  // (5, 2)
  map[2 * 12 + 6] = 8.0f;  // (6, 2): overlaps the first
  map[0 * 12 + 0] = 7.0f;  // (0, 0): block leaves the map
  map[6 * 12 + 9] = 6.0f;  // (9, 6)
  map[7 * 12 + 2] = 0.0f;  // not measured
  std::vector<std::array<int, 2>> pts;
  ASSERT_EQ(topNpoints(map, 12, 8, 2, 4, 2, pts), 2);
  EXPECT_EQ(pts[0], (std::array<int, 2>{5, 2}));
  EXPECT_EQ(pts[1], (std::array<int, 2>{9, 6}));
  // Asked for more than fit: every kept block is inside and apart from the others.
  const int n = topNpoints(map, 12, 8, 50, 4, 2, pts);
  EXPECT_GT(n, 2);
  for (int i = 0; i < n; ++i) {
    EXPECT_GE(pts[i][0] - 2, 0);
    EXPECT_LE(pts[i][0] - 2 + 4, 12);
    EXPECT_GE(pts[i][1] - 1, 0);
    EXPECT_LE(pts[i][1] - 1 + 2, 8);
    EXPECT_FALSE(pts[i][0] == 2 && pts[i][1] == 7);
    for (int k = 0; k < i; ++k)
      EXPECT_FALSE(std::abs(pts[i][0] - pts[k][0]) < 4 && std::abs(pts[i][1] - pts[k][1]) < 2);
  }
  // A constant map still yields blocks (its histogram has one bin).
  std::vector<float> flat(96, 3.0f);
  EXPECT_GT(topNpoints(flat, 12, 8, 4, 4, 2, pts), 0);
}

TEST(DopplerBlockStats, CentroidPowerContrastAndInvalidBlocks) {
  dcestconf c = testing::estimator_config();
  c.Blocks = 8;
  c.Blockl = 64;
  c.r0 = bspline3(0.0);
  c.r1 = bspline3(0.86);
  // A tone of 0.3 cycles per line in every bin.
  std::vector<fcomplex> block(8 * 64);
  for (int l = 0; l < 64; ++l)
    for (int s = 0; s < 8; ++s) block[static_cast<std::size_t>(l * 8 + s)] = std::polar(2.0f, static_cast<float>(kTwoPi * 0.3 * l + s));
  dcblock b;
  blockstats(c, block, b);
  ASSERT_EQ(b.valid, 1);
  EXPECT_NEAR(b.centroid, 0.3, 1e-6);
  EXPECT_NEAR(b.power, 64 * 4.0, 1e-3);
  EXPECT_NEAR(b.contrast, 1.0, 1e-6);  // constant amplitude
  // All zero (or all NaN, which reads as zero): F = 0.
  std::vector<fcomplex> zero(8 * 64);
  blockstats(c, zero, b);
  EXPECT_EQ(b.valid, 0);
  // One line: no lag-one term.
  c.Blockl = 1;
  blockstats(c, std::span<const fcomplex>(block).first(8), b);
  EXPECT_EQ(b.valid, 0);
}

TEST(DopplerBlockStats, ResultsDoNotDependOnTheThreadCount) {
#ifndef _OPENMP
  GTEST_SKIP() << "built without OpenMP";
#else
  testing::SceneSpec shape;
  shape.lines = 2048;
  shape.samples = 1024;
  shape.centroid = 300.0;
  shape.highContrast = true;
  shape.brightSpacing = 1024;
  const auto scene = testing::make_scene(shape);
  auto run = [&](int threads) {
    omp_set_num_threads(threads);
    dcestconf c = testing::estimator_config();
    c.coreMatrix = scene;
    c.r0 = bspline3(0.0);
    c.r1 = bspline3(0.86);
    dcimage im = testing::image_of(shape);
    EXPECT_EQ(setprocbuf(c, im), 0);
    EXPECT_EQ(getnadcbins(c, im), 0);
    return c;
  };
  const dcestconf one = run(1);
  const dcestconf three = run(3);
  omp_set_num_threads(omp_get_num_procs());
  ASSERT_EQ(one.blocks.size(), three.blocks.size());
  for (std::size_t i = 0; i < one.blocks.size(); ++i) {
    EXPECT_EQ(one.blocks[i].centroid, three.blocks[i].centroid);
    EXPECT_EQ(one.blocks[i].contrast, three.blocks[i].contrast);
    EXPECT_EQ(one.blocks[i].noise, three.blocks[i].noise);
  }
  EXPECT_EQ(0, std::memcmp(one.contrastMap.data(), three.contrastMap.data(), one.contrastMap.size() * sizeof(float)));
  EXPECT_EQ(0, std::memcmp(one.powerMap.data(), three.powerMap.data(), one.powerMap.size() * sizeof(float)));
#endif
}

TEST(DopplerContrast, EdgeMarginOfHalfTheMapLeavesNothing) {
  dcestconf c = testing::estimator_config();
  c.patchesAcross = 8;
  c.patchesDown = 4;
  c.powerMap.assign(32, 1.0f);
  c.contrastMap.assign(32, 2.0f);
  c.Dswst = 4 * c.Patchs;
  getcontrast(c);
  for (float v : c.contrastMap) EXPECT_EQ(v, 0.0f);
  c.powerMap.assign(32, 1.0f);
  c.contrastMap.assign(32, 2.0f);
  c.Dswst = 0;
  getcontrast(c);
  // Interior patches: smoothing of constant maps keeps the ratio only where the box is whole.
  EXPECT_GT(c.contrastMap[1 * 8 + 4], 0.0f);
  EXPECT_EQ(c.contrastMap[1 * 8 + 0], 0.0f);  // column 0 is never above the margin
}

TEST(DopplerFill, NeighboursAreAveragedAsPhasors) {
  // 3 x 3 blocks around a bad centre; neighbours at 0.49 and -0.49 PRF.
  dcestconf c = grid(3, 3, {0.49, -0.49});
  c.blocks[4].valid = 0;
  const dcimage im = image_for(c);
  ratesnr(c);
  ASSERT_EQ(fillblocks(c, im), 0);
  EXPECT_EQ(c.blocks[4].filled, 1);
  // Their mean is half a PRF; the mean of the fractions would be 0.
  EXPECT_NEAR(std::fabs(c.blocks[4].centroid), 0.5, 1e-9);
  // No valid block at all: the fill has nothing to start from.
  dcestconf none = grid(3, 3, {0.1});
  for (auto& b : none.blocks) b.valid = 0;
  ratesnr(none);
  EXPECT_EQ(fillblocks(none, image_for(none)), -1);
}

TEST(DopplerPolynomial, PlaneSearchAndFitRecoverALinearField) {
  // Field f = 0.2 + 3e-4 x - 1e-4 y cycles, wrapped into -0.5..0.5.
  dcestconf c = grid(8, 6, {});
  for (auto& b : c.blocks) b.centroid = testing::wrap_half(0.2 + 3e-4 * b.sample - 1e-4 * b.line);
  const dcimage im = image_for(c);
  ratesnr(c);
  ASSERT_EQ(fillblocks(c, im), 0);
  ASSERT_EQ(getkrstd(im, c), 0);
  std::array<double, 3> plane{};
  ASSERT_EQ(unwrapdcbin(c, plane), 0);
  std::array<double, 7> coef{};
  ASSERT_EQ(getdccoef(c, plane, coef), 0);
  // Equal up to whole cycles.
  EXPECT_NEAR(testing::wrap_half(coef[0] - 0.2), 0.0, 1e-6);
  EXPECT_NEAR(coef[1], 3e-4, 1e-9);
  EXPECT_NEAR(coef[2], -1e-4, 1e-9);
  for (std::size_t j = 3; j < 7; ++j) EXPECT_NEAR(coef[j], 0.0, 1e-12);

  // A constant field has a plane of zero slopes.
  dcestconf k = grid(4, 3, {0.37});
  ASSERT_EQ(unwrapdcbin(k, plane), 0);
  EXPECT_EQ(plane[0], 0.0);
  EXPECT_EQ(plane[1], 0.0);
  EXPECT_NEAR(plane[2], 0.37, 1e-6);
}

TEST(DopplerPolynomial, FilledBlocksAndMasksStayOutOfTheFit) {
  dcestconf c = grid(4, 3, {0.1});
  for (auto& b : c.blocks) b.centroid = 0.1 + 1e-5 * b.sample;
  const dcimage im = image_for(c);
  ratesnr(c);
  ASSERT_EQ(getkrstd(im, c), 0);
  std::array<double, 3> plane{};
  ASSERT_EQ(unwrapdcbin(c, plane), 0);
  std::array<double, 7> ref{};
  ASSERT_EQ(getdccoef(c, plane, ref), 0);
  // A filled block with a wild centroid changes nothing.
  c.blocks[5].good = 0;
  c.blocks[5].filled = 1;
  c.blocks[5].centroid = -0.4;
  std::array<double, 7> coef{};
  ASSERT_EQ(getdccoef(c, plane, coef), 0);
  for (std::size_t j = 0; j < 7; ++j) EXPECT_NEAR(coef[j], ref[j], 1e-12) << j;
  // 11 good blocks work, 7 do not, 8 do.
  for (int i = 0; i < 4; ++i) c.blocks[static_cast<std::size_t>(i)].good = 0;
  EXPECT_EQ(getdccoef(c, plane, coef), 10);
  c.blocks[0].good = 1;
  EXPECT_EQ(getdccoef(c, plane, coef), 0);
  // A mask of zeros gives a zero polynomial.
  c.Pol_Weights = {0, 0, 0, 0, 0, 0, 0};
  ASSERT_EQ(getdccoef(c, plane, coef), 0);
  for (double v : coef) EXPECT_EQ(v, 0.0);
}

// A scene one block wide (or two) cannot fix the range terms of the surface: they stay zero and
// the azimuth slope is still found, where the full fit would be singular.
TEST(DopplerPolynomial, NarrowGridsFitOnlyTheTermsTheyDetermine) {
  struct Case {
    int across, rows;
    std::array<bool, 7> fitted;  // terms 1, x, y, xy, x^2, x^3, x^4 with a non-zero slope expected
  };
  for (const Case k : {Case{1, 12, {true, false, true, false, false, false, false}},
                       Case{2, 8, {true, true, true, true, false, false, false}}}) {
    SCOPED_TRACE(k.across);
    dcestconf c = grid(k.across, k.rows, {});
    for (auto& b : c.blocks) b.centroid = testing::wrap_half(0.1 + 2e-5 * b.sample - 1e-4 * b.line);
    const dcimage im = image_for(c);
    ratesnr(c);
    ASSERT_EQ(getkrstd(im, c), 0);
    std::array<double, 3> plane{};
    ASSERT_EQ(unwrapdcbin(c, plane), 0);
    std::array<double, 7> coef{};
    ASSERT_EQ(getdccoef(c, plane, coef), 0);
    for (double v : coef) EXPECT_TRUE(std::isfinite(v));
    EXPECT_NEAR(coef[2], -1e-4, 1e-9);
    if (k.fitted[1]) {
      EXPECT_NEAR(coef[1], 2e-5, 1e-9);
    }
    for (std::size_t j = 4; j < 7; ++j) EXPECT_EQ(coef[j], 0.0) << j;
  }
}

TEST(DopplerWdar, BinsAreSymmetricAboutZeroFrequency) {
  // i / Blocks <= h and >= 1 - h in floating point take one bin more on the positive side
  // for these sizes.
  for (const auto& [blocks, band] : std::vector<std::pair<int, double>>{{100, 0.82}, {50, 0.36}, {200, 0.57}, {256, 0.8}, {255, 0.8}}) {
    const auto used = wdar_bins(blocks, band);
    int pos = 0, neg = 0;
    for (int i = 1; i < blocks; ++i) {
      if (!used[static_cast<std::size_t>(i)]) continue;
      (i < (blocks + 1) / 2 ? pos : neg) += 1;
    }
    EXPECT_EQ(pos, neg) << blocks << " " << band;
    EXPECT_EQ(used[0], 1);
    EXPECT_EQ(pos, static_cast<int>(std::floor(band / 2 * blocks + 1e-9)));
  }
}

// A block whose range frequency f_r (fraction of fs) has an azimuth tone at
// (A (1 + f_r fs / f0)) cycles per line: the signature of an absolute centroid of A PRF.
std::vector<fcomplex> wdar_block(const dcestconf& c, double A) {
  const int ns = c.Blocks, nl = c.Blockl;
  dsp::cvector shape(static_cast<std::size_t>(ns * nl));
  testing::Random rnd(3);
  for (int i = 0; i < ns; ++i) {
    const double fr = (i <= ns / 2 ? i : i - ns) / static_cast<double>(ns);
    const double cyc = A * (1.0 + fr * c.fs / c.carrier);
    const double ph0 = kTwoPi * rnd.uniform();
    for (int l = 0; l < nl; ++l)
      shape[static_cast<std::size_t>(l * ns + i)] = std::polar(1.0f, static_cast<float>(ph0 + kTwoPi * cyc * l));
  }
  dsp::fft_c(ns, ns, nl, nl, -1, 0, shape);
  return {shape.begin(), shape.end()};
}

TEST(DopplerWdar, SignedSlopeGivesTheAbsoluteCentroid) {
  dcestconf c = testing::estimator_config();
  ASSERT_EQ(wdar_init(c), 0);
  for (const double A : {-2.3, -0.4, 0.45, 2.7, 6.2}) {
    const auto block = wdar_block(c, A);
    double est = 0.0;
    ASSERT_EQ(wdar_estimate(c, block, testing::wrap_half(A), est), 0);
    // Read on the unshifted transform the answer would be off by Blocks/2 f0/fs PRF.
    EXPECT_NEAR(est, A, 0.05) << A;
  }
  wdar_free(c);
  double est = 0.0;
  EXPECT_EQ(wdar_estimate(c, wdar_block(c, 1.0), 0.0, est), -1);
}

TEST(DopplerMlbf, NeedsItsInitsAndValidSettings) {
  dcestconf c = testing::estimator_config();
  c.mlbfBlocks.resize(1);
  std::vector<fcomplex> block(static_cast<std::size_t>(c.Blocks * c.Blockl), fcomplex(1.0f, 0.0f));
  EXPECT_EQ(multimlbf(c, block, 0), 1);
  c.Nummlbf = 0;
  EXPECT_EQ(multimlbf_init(c), 10);
  c.Nummlbf = 4;
  c.Flength = 16;  // even: one tap is added
  ASSERT_EQ(multimlbf_init(c), 0);
  ASSERT_EQ(cirpZ_init(c), 0);
  ASSERT_EQ(multimlbf(c, block, 0), 0);
  EXPECT_EQ(c.mlbfBlocks[0].estimates.size(), 4u);
  for (double e : c.mlbfBlocks[0].estimates) EXPECT_TRUE(std::isfinite(e));
  mlbf_free(c);
  EXPECT_EQ(multimlbf(c, block, 0), 1);
}

}  // namespace
}  // namespace sar::doppler

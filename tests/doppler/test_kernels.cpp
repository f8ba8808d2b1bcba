// The estimator's vectorised and parallel paths against the plain arithmetic they stand for:
// the results must agree to the bit, whatever the instruction set and the thread count.
#include <gtest/gtest.h>

#include <cmath>
#include <cstring>
#include <limits>
#include <numbers>
#include <vector>

#ifdef _OPENMP
#include <omp.h>
#endif

#include "doppler/dcest.hpp"
#include "dsp/czt.hpp"
#include "dsp/filters.hpp"
#include "test_support.hpp"

namespace sar::doppler {
namespace {

constexpr double kPi = std::numbers::pi;

// A small range-compressed scene with bright points, some non-finite samples and a line of NaN.
std::vector<fcomplex> spoiled_scene(const testing::SceneSpec& shape) {
  std::vector<fcomplex> scene = testing::make_scene(shape);
  const float inf = std::numeric_limits<float>::infinity(), nan = std::numeric_limits<float>::quiet_NaN();
  for (int l = 0; l < shape.lines; l += 5) scene[static_cast<std::size_t>(l) * shape.samples + (l * 7) % shape.samples] = {inf, 1.0f};
  for (int l = 3; l < shape.lines; l += 11) scene[static_cast<std::size_t>(l) * shape.samples + (l * 3) % shape.samples] = {0.5f, nan};
  for (int s = 0; s < shape.samples; ++s) scene[static_cast<std::size_t>(700) * shape.samples + s] = {nan, nan};
  return scene;
}

testing::SceneSpec small_bright() {
  testing::SceneSpec shape;
  shape.seed = 7;
  shape.lines = 1024;
  shape.samples = 960;
  shape.centroid = 1.3 * shape.prf;
  shape.highContrast = true;
  shape.brightSpacing = 1024;
  shape.brightPower = 1000.0;
  return shape;
}

// Block statistics and patch maps as the plain loops compute them, sample by sample.
void plain_block_pass(const dcestconf& c, std::span<const fcomplex> image, int samples, dcestconf& out) {
  const float area = static_cast<float>(c.Patchs) * static_cast<float>(c.Patchl);
  for (int r = 0; r < out.blockRows; ++r)
    for (int k = 0; k < out.blocksAcross; ++k) {
      const int left = k * c.Blocks, top = r * c.Blockl;
      std::vector<fcomplex> block(static_cast<std::size_t>(c.Blocks) * c.Blockl);
      for (int l = 0; l < c.Blockl; ++l)
        for (int s = 0; s < c.Blocks; ++s) {
          const fcomplex v = image[static_cast<std::size_t>(top + l) * samples + left + s];
          block[static_cast<std::size_t>(l) * c.Blocks + s] =
              std::isfinite(v.real()) && std::isfinite(v.imag()) ? v : fcomplex(0.0f, 0.0f);
        }
      double P = 0.0, F = 0.0, Rr = 0.0, Ri = 0.0;
      for (int s = 0; s < c.Blocks; ++s) {
        double p = 0.0, f = 0.0, rr = 0.0, ri = 0.0;
        for (int l = 0; l < c.Blockl; ++l) {
          const fcomplex x = block[static_cast<std::size_t>(l) * c.Blocks + s];
          const double w = static_cast<double>(x.real()) * x.real() + static_cast<double>(x.imag()) * x.imag();
          p += w;
          f += w * w;
          if (l + 1 < c.Blockl) {
            const fcomplex y = block[static_cast<std::size_t>(l + 1) * c.Blocks + s];
            rr += static_cast<double>(x.real()) * y.real() + static_cast<double>(x.imag()) * y.imag();
            ri += static_cast<double>(x.real()) * y.imag() - static_cast<double>(x.imag()) * y.real();
          }
        }
        P += p;
        F += f;
        Rr += rr;
        Ri += ri;
      }
      dcblock& b = out.blocks[static_cast<std::size_t>(r) * out.blocksAcross + k];
      b.valid = 0;
      const double pm = P / c.Blocks, a = std::hypot(Rr, Ri) / c.Blocks;
      if (F > 0.0 && a > 0.0 && pm / a < c.Sthr) {
        b.valid = 1;
        b.centroid = std::atan2(Ri, Rr) / (2.0 * kPi);
        b.contrast = static_cast<double>(c.Blockl) * c.Blocks * F / (P * P);
        b.noise = pm - (c.r0 / c.r1) * a;
      }
      for (int l = 0; l < c.Blockl; ++l)
        for (int s = 0; s < c.Blocks; ++s) {
          const std::size_t m = static_cast<std::size_t>((top + l) / c.Patchl) * out.patchesAcross + (left + s) / c.Patchs;
          const float w = std::norm(block[static_cast<std::size_t>(l) * c.Blocks + s]);
          out.powerMap[m] += w / area;
          out.contrastMap[m] += w * w / area;
        }
    }
}

TEST(DopplerKernels, BlockPassGivesThePlainSums) {
  const testing::SceneSpec shape = small_bright();
  const auto scene = spoiled_scene(shape);
  struct Grid {
    int blocks, blockl, patchs, patchl;
  };
  // Patches of a power-of-two area (scaled by a multiplication) and of 48 x 64 samples (a
  // division; five patches a block, one more than the patch loop takes at once).
  for (const Grid g : {Grid{256, 512, 32, 64}, Grid{240, 256, 48, 64}}) {
    dcestconf c = testing::estimator_config();
    c.Blocks = g.blocks;
    c.Blockl = g.blockl;
    c.Patchs = g.patchs;
    c.Patchl = g.patchl;
    c.coreMatrix = scene;
    c.r0 = bspline3(0.0);
    c.r1 = bspline3(0.86);
    dcimage im = testing::image_of(shape);
    ASSERT_EQ(setprocbuf(c, im), 0);
    dcestconf plain = c;
    ASSERT_EQ(getnadcbins(c, im), 0);
    plain_block_pass(c, scene, shape.samples, plain);
    ASSERT_EQ(getcontrast(plain), 0);
    for (std::size_t i = 0; i < c.blocks.size(); ++i) {
      EXPECT_EQ(c.blocks[i].valid, plain.blocks[i].valid) << g.blocks << " block " << i;
      EXPECT_EQ(c.blocks[i].centroid, plain.blocks[i].centroid) << g.blocks << " block " << i;
      EXPECT_EQ(c.blocks[i].contrast, plain.blocks[i].contrast) << g.blocks << " block " << i;
      EXPECT_EQ(c.blocks[i].noise, plain.blocks[i].noise) << g.blocks << " block " << i;
    }
    EXPECT_EQ(0, std::memcmp(c.powerMap.data(), plain.powerMap.data(), c.powerMap.size() * sizeof(float))) << g.blocks;
    EXPECT_EQ(0, std::memcmp(c.contrastMap.data(), plain.contrastMap.data(), c.contrastMap.size() * sizeof(float)))
        << g.blocks;
  }
}

// One look pair of the beat frequency estimator with std::complex<float> arithmetic: beat
// power spectrum of the block.
std::vector<double> plain_beat_spectrum(const dcestconf& c, std::span<const fcomplex> block, double separation, int M,
                                        double fstart) {
  const int lf = c.Flength, ns = c.Blocks, nl = c.Blockl, dec = c.Decfac;
  std::vector<fcomplex> proto(static_cast<std::size_t>(lf));
  const double B = c.RgBand;
  const double bands[4] = {0.0, (c.Lookbf * B - c.Lookbt * B) / 2.0, (c.Lookbf * B + c.Lookbt * B) / 2.0, 0.5};
  const double desired[2] = {1.0, 0.0};
  const double weights[2] = {c.Lookrp / c.Lookrs, 1.0};
  EXPECT_EQ(dsp::remezOBX(proto, lf, 2, bands, desired, weights), 0);
  std::vector<fcomplex> up(static_cast<std::size_t>(lf)), lo(up.size());
  for (int t = 0; t < lf; ++t) {
    const double a = (t - (lf - 1) / 2) * separation * kPi, p = proto[static_cast<std::size_t>(t)].real();
    up[static_cast<std::size_t>(lf - 1 - t)] = fcomplex(static_cast<float>(p * std::cos(a)), static_cast<float>(p * std::sin(a)));
    lo[static_cast<std::size_t>(lf - 1 - t)] = fcomplex(static_cast<float>(p * std::cos(a)), static_cast<float>(-p * std::sin(a)));
  }
  const int nd = (ns - 2 * (lf / 2) + dec - 1) / dec;
  std::vector<fcomplex> beat(static_cast<std::size_t>(nd) * nl);
  for (int l = 0; l < nl; ++l)
    for (int j = 0; j < nd; ++j) {
      fcomplex u(0.0f, 0.0f), w(0.0f, 0.0f);
      for (int t = 0; t < lf; ++t) {
        u += block[static_cast<std::size_t>(l) * ns + j * dec + t] * up[static_cast<std::size_t>(t)];
        w += block[static_cast<std::size_t>(l) * ns + j * dec + t] * lo[static_cast<std::size_t>(t)];
      }
      beat[static_cast<std::size_t>(j) * nl + l] = u * std::conj(w);
    }
  for (auto& b : beat) b /= std::abs(b);
  std::vector<fcomplex> zoomed(static_cast<std::size_t>(nd) * M);
  EXPECT_EQ(dsp::czt_c(beat, nl, zoomed, M, -2.0 * kPi * c.Dftstep, 2.0 * kPi * fstart, nd), 0);
  std::vector<double> power(static_cast<std::size_t>(M));
  for (int k = 0; k < M; ++k) {
    double sum = 0.0;
    for (int j = 0; j < nd; ++j) sum += std::norm(zoomed[static_cast<std::size_t>(j) * M + k]);
    power[static_cast<std::size_t>(k)] = sum / nd / nl;
  }
  return power;
}

TEST(DopplerKernels, LookFiltersGiveTheComplexArithmetic) {
  const testing::SceneSpec shape = small_bright();
  const auto scene = testing::make_scene(shape);
  // Three decimation factors: the polyphase split of the lines and the padding lanes change.
  for (const int dec : {4, 3, 1}) {
    dcestconf c = testing::estimator_config();
    c.Decfac = dec;
    c.Nummlbf = 2;
    c.mlbfBlocks.resize(1);
    std::vector<fcomplex> block(static_cast<std::size_t>(c.Blocks) * c.Blockl);
    for (int l = 0; l < c.Blockl; ++l)
      for (int s = 0; s < c.Blocks; ++s)
        block[static_cast<std::size_t>(l) * c.Blocks + s] = scene[static_cast<std::size_t>(l + 200) * shape.samples + s + 64];
    ASSERT_EQ(multimlbf_init(c), 0);
    ASSERT_EQ(cirpZ_init(c), 0);
    std::string log;
    ASSERT_EQ(multimlbf(c, block, 0, &log), 0);
    mlbf_free(c);
    EXPECT_NE(log.find("Evaluating MLBF 2 of 2...estimation: "), std::string::npos) << log;

    // The estimate of each pair is the parabola vertex of its beat power spectrum.
    const double B = c.RgBand, s0 = 2.0 * c.Lookbf * B, ds = ((1.0 - c.Lookbf) * B - s0) / (c.Nummlbf - 1);
    const double sLast = s0 + ds;
    const int M = static_cast<int>(std::ceil(c.fs / c.carrier * std::fabs(c.Maxamb - c.Minamb) * sLast / c.Dftstep));
    const double fstart = c.fs / c.carrier * sLast * c.Minamb;
    for (int i = 0; i < 2; ++i) {
      const double sep = s0 + i * ds;
      const auto power = plain_beat_spectrum(c, block, sep, M, fstart);
      int k0 = 0;
      for (int k = 1; k < M; ++k)
        if (power[static_cast<std::size_t>(k)] > power[static_cast<std::size_t>(k0)]) k0 = k;
      double freq = k0 * c.Dftstep;
      if (k0 > 0 && k0 < M - 1) {
        const double y0 = power[static_cast<std::size_t>(k0 - 1)], y1 = power[static_cast<std::size_t>(k0)],
                     y2 = power[static_cast<std::size_t>(k0 + 1)];
        if (y0 - 2.0 * y1 + y2 != 0.0) freq = (k0 + 0.5 * (y0 - y2) / (y0 - 2.0 * y1 + y2)) * c.Dftstep;
      }
      EXPECT_EQ(c.mlbfBlocks[0].estimates[static_cast<std::size_t>(i)], c.carrier / c.fs / sep * (fstart + freq))
          << "Decfac " << dec << " pair " << i;
    }
  }
}

TEST(DopplerKernels, EstimatorsDoNotDependOnTheThreadCount) {
#ifndef _OPENMP
  GTEST_SKIP() << "built without OpenMP";
#else
  const testing::SceneSpec shape = small_bright();
  const auto scene = spoiled_scene(shape);
  auto run = [&](int threads) {
    omp_set_num_threads(threads);
    dcestconf c = testing::estimator_config();
    c.coreMatrix = scene;
    c.geometricCentroid = shape.centroid;
    c.Blocks = 128;  // enough blocks in the small scene for the fit
    c.Blockl = 256;
    c.Nwdarblocks = 12;
    dcimage im = testing::image_of(shape);
    DopplerPoly poly{};
    EXPECT_EQ(getnadcpoly(im, c, poly), 0);
    return std::make_pair(c, poly);
  };
  const auto [one, polyOne] = run(1);
  const auto [three, polyThree] = run(3);
  omp_set_num_threads(omp_get_num_procs());
  for (std::size_t i = 0; i < 9; ++i) EXPECT_EQ(polyOne[i], polyThree[i]) << i;
  EXPECT_EQ(one.ambiguity, three.ambiguity);
  EXPECT_EQ(one.decision, three.decision);
  ASSERT_EQ(one.mlbfBlocks.size(), three.mlbfBlocks.size());
  ASSERT_GT(one.mlbfBlocks.size(), 1u);
  for (std::size_t b = 0; b < one.mlbfBlocks.size(); ++b) {
    EXPECT_EQ(one.mlbfBlocks[b].estimates, three.mlbfBlocks[b].estimates) << b;
    EXPECT_EQ(one.mlbfBlocks[b].quality, three.mlbfBlocks[b].quality) << b;
  }
  ASSERT_EQ(one.wdarBlocks.size(), three.wdarBlocks.size());
  ASSERT_GT(one.wdarBlocks.size(), 1u);
  for (std::size_t b = 0; b < one.wdarBlocks.size(); ++b) EXPECT_EQ(one.wdarBlocks[b].estimate, three.wdarBlocks[b].estimate) << b;
#endif
}

}  // namespace
}  // namespace sar::doppler

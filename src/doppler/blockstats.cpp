// Entry of the estimator and the statistics of the block grid: fractional centroid (phase of the
// lag-one azimuth autocorrelation), power, noise, contrast, and the patch maps of power from
// which the contrast map is made.
#include <algorithm>
#include <cmath>
#include <cstdio>
#include <fstream>
#include <numbers>
#include <optional>
#include <string>
#include <vector>

#if defined(__SSE2__)
#include <emmintrin.h>
#include <xmmintrin.h>
#endif

#include "base/diagnostics.hpp"
#include "base/parallel.hpp"
#include "base/run_services.hpp"
#include "doppler/dcest.hpp"

namespace sar::doppler {
namespace {

constexpr double kTwoPi = 2.0 * std::numbers::pi;

int rejected(const char* text) {
  base::report(base::kReportError, text);
  return 10;
}

/// Reads `rows` lines of the range file starting at `firstLine` into `buffer`.
int read_rows(const std::string& path, int64_t samples, int64_t firstLine, int64_t rows, std::vector<fcomplex>& buffer) {
  std::ifstream in(path, std::ios::binary);
  if (!in) {
    base::report(base::kReportError, "Cannot open the range-compressed file " + path);
    return 2;
  }
  const int64_t count = samples * rows;
  buffer.resize(static_cast<std::size_t>(count));
  in.seekg(static_cast<std::streamoff>(firstLine * samples * static_cast<int64_t>(sizeof(fcomplex))));
  in.read(reinterpret_cast<char*>(buffer.data()), static_cast<std::streamsize>(count * sizeof(fcomplex)));
  if (!in || in.gcount() != static_cast<std::streamsize>(count * sizeof(fcomplex))) {
    base::report(base::kReportError, "The range-compressed file is shorter than its description: " + path);
    return 2;
  }
  return 0;
}

/// Real and imaginary parts of n samples; a sample with a non-finite part becomes 0. The
/// same samples of a line further down (`ahead`, may be null) are asked for meanwhile, a
/// cache line per cache line read: the lines of a block lie far apart in the image, and each
/// would start a new stream for the hardware prefetcher.
void split(const fcomplex* src, const fcomplex* ahead, int n, float* re, float* im) {
  int s = 0;
#if defined(__SSE2__)
  const __m128i exponent = _mm_set1_epi32(0x7f800000);
  for (; s + 4 <= n; s += 4) {
    if (ahead && s % 8 == 0) _mm_prefetch(reinterpret_cast<const char*>(ahead + s), _MM_HINT_T0);
    const __m128 a = _mm_loadu_ps(reinterpret_cast<const float*>(src + s));      // r0 i0 r1 i1
    const __m128 b = _mm_loadu_ps(reinterpret_cast<const float*>(src + s + 2));  // r2 i2 r3 i3
    // A part is not finite when its exponent bits are all set; the sample goes with it.
    __m128i badA = _mm_cmpeq_epi32(_mm_and_si128(_mm_castps_si128(a), exponent), exponent);
    __m128i badB = _mm_cmpeq_epi32(_mm_and_si128(_mm_castps_si128(b), exponent), exponent);
    badA = _mm_or_si128(badA, _mm_shuffle_epi32(badA, _MM_SHUFFLE(2, 3, 0, 1)));
    badB = _mm_or_si128(badB, _mm_shuffle_epi32(badB, _MM_SHUFFLE(2, 3, 0, 1)));
    const __m128 x = _mm_andnot_ps(_mm_castsi128_ps(badA), a);
    const __m128 y = _mm_andnot_ps(_mm_castsi128_ps(badB), b);
    _mm_storeu_ps(re + s, _mm_shuffle_ps(x, y, _MM_SHUFFLE(2, 0, 2, 0)));
    _mm_storeu_ps(im + s, _mm_shuffle_ps(x, y, _MM_SHUFFLE(3, 1, 3, 1)));
  }
#else
  (void)ahead;
#endif
  for (; s < n; ++s) {
    const bool ok = std::isfinite(src[s].real()) && std::isfinite(src[s].imag());
    re[s] = ok ? src[s].real() : 0.0f;
    im[s] = ok ? src[s].imag() : 0.0f;
  }
}

// The per-line sums are built for the widest vector unit the processor has: every lane does
// the operations of the plain loop in the same order, and no multiply-add contraction is
// allowed in this library, so the choice changes no bit of the result.
#if defined(__GNUC__) && defined(__x86_64__) && !defined(__SANITIZE_ADDRESS__)
#define SAR_LINE_KERNEL [[gnu::target_clones("avx512f", "avx2", "default")]]
#else
#define SAR_LINE_KERNEL
#endif

/// Power and squared power of every range bin of one line, and with the previous line
/// (prevRe, prevIm not null) the lag-one product conj(previous) x.
SAR_LINE_KERNEL void line_sums(int n, const float* __restrict re, const float* __restrict im,
                               const float* __restrict prevRe, const float* __restrict prevIm, double* __restrict p,
                               double* __restrict f, double* __restrict rr, double* __restrict ri) {
  if (prevRe) {
    for (int s = 0; s < n; ++s) {
      const double xr = prevRe[s], xi = prevIm[s], yr = re[s], yi = im[s];
      const double w = yr * yr + yi * yi;
      p[s] += w;
      f[s] += w * w;
      rr[s] += xr * yr + xi * yi;
      ri[s] += xr * yi - xi * yr;
    }
  } else {
    for (int s = 0; s < n; ++s) {
      const double yr = re[s], yi = im[s];
      const double w = yr * yr + yi * yi;
      p[s] += w;
      f[s] += w * w;
    }
  }
}

/// Patch terms of one line: |x|^2 / area and |x|^4 / area in single precision (a power of two
/// area as a multiplication by its exact inverse).
SAR_LINE_KERNEL void patch_terms(int n, const float* __restrict re, const float* __restrict im, float* __restrict w,
                                 float* __restrict w2, float area, bool pow2) {
  if (pow2) {
    const float inverse = 1.0f / area;
    for (int s = 0; s < n; ++s) {
      const float v = re[s] * re[s] + im[s] * im[s];
      w[s] = v * inverse;
      w2[s] = (v * v) * inverse;
    }
  } else {
    for (int s = 0; s < n; ++s) {
      const float v = re[s] * re[s] + im[s] * im[s];
      w[s] = v / area;
      w2[s] = (v * v) / area;
    }
  }
}

/// One pass over a block in its matrix (`pitch` samples a row): the lag-one statistics of
/// every range bin and, when maps are given, the block's share of the patch maps. Non-finite
/// samples count as zero (lines filled with NaN by the extraction carry no signal).
///
/// The sums are those of a straightforward loop, term by term in the same order: per range
/// bin in double over the lines, bins added in range order; per patch in float over its lines
/// and, within a line, its samples. Only the layout differs: a line is split into real and
/// imaginary parts once, and the per-bin sums and the patch terms run over whole lines.
class BlockPass {
 public:
  /// Lines read ahead.
  static constexpr int kAhead = 4;

  BlockPass(int blocks, int blockl) : ns_(blocks), nl_(blockl) {
    const std::size_t n = static_cast<std::size_t>(blocks);
    for (auto* v : {&re_, &im_, &prevRe_, &prevIm_, &w_, &w2_}) v->resize(n);
    for (auto* v : {&p_, &f_, &rr_, &ri_}) v->resize(n);
  }

  /// Patch maps of `across` patches a row, of patchs x patchl samples of `area` (float).
  struct Maps {
    float* power = nullptr;
    float* contrast = nullptr;
    int64_t across = 0;
    int patchs = 1;
    int patchl = 1;
    float area = 1.0f;
  };

  /// The block with top-left corner `topLeft` at (left, top) of the image.
  void run(const dcestconf& conf, const fcomplex* topLeft, int64_t pitch, dcblock& out, const Maps* maps, int left,
           int top) {
    const int ns = ns_;
    std::fill(p_.begin(), p_.end(), 0.0);
    std::fill(f_.begin(), f_.end(), 0.0);
    std::fill(rr_.begin(), rr_.end(), 0.0);
    std::fill(ri_.begin(), ri_.end(), 0.0);
    // Division by a power of two is exact as a multiplication by its inverse.
    int exponent = 0;
    const bool pow2 = maps && std::frexp(maps->area, &exponent) == 0.5f;
    for (int l = 0; l < nl_; ++l) {
      const fcomplex* src = topLeft + static_cast<int64_t>(l) * pitch;
      float* re = re_.data();
      float* im = im_.data();
      split(src, l + kAhead < nl_ ? src + kAhead * pitch : nullptr, ns, re, im);
      line_sums(ns, re, im, l > 0 ? prevRe_.data() : nullptr, l > 0 ? prevIm_.data() : nullptr, p_.data(), f_.data(),
                rr_.data(), ri_.data());
      if (maps) add_line(*maps, pow2, left, top + l);
      re_.swap(prevRe_);
      im_.swap(prevIm_);
    }
    finish(conf, out);
  }

 private:
  void add_line(const Maps& m, bool pow2, int left, int line) {
    const int ns = ns_;
    float* w = w_.data();
    float* w2 = w2_.data();
    patch_terms(ns, re_.data(), im_.data(), w, w2, m.area, pow2);
    // The patches of the line, each summed in sample order.
    const int64_t rowBase = static_cast<int64_t>(line / m.patchl) * m.across;
    int s = 0;
    if (left % m.patchs == 0) {
      // Whole patches four at a time: four independent chains of additions.
      const int width = m.patchs;
      for (; s + 4 * width <= ns; s += 4 * width) {
        const std::size_t k = static_cast<std::size_t>(rowBase + (left + s) / width);
        float* pw = m.power + k;
        float* cw = m.contrast + k;
        float a0 = pw[0], a1 = pw[1], a2 = pw[2], a3 = pw[3];
        float b0 = cw[0], b1 = cw[1], b2 = cw[2], b3 = cw[3];
        const float* u = w + s;
        const float* v = w2 + s;
        for (int q = 0; q < width; ++q) {
          a0 += u[q];
          a1 += u[q + width];
          a2 += u[q + 2 * width];
          a3 += u[q + 3 * width];
          b0 += v[q];
          b1 += v[q + width];
          b2 += v[q + 2 * width];
          b3 += v[q + 3 * width];
        }
        pw[0] = a0;
        pw[1] = a1;
        pw[2] = a2;
        pw[3] = a3;
        cw[0] = b0;
        cw[1] = b1;
        cw[2] = b2;
        cw[3] = b3;
      }
    }
    while (s < ns) {
      const int x = left + s;
      const int end = std::min(ns, (x / m.patchs + 1) * m.patchs - left);
      const std::size_t k = static_cast<std::size_t>(rowBase + x / m.patchs);
      float a = m.power[k], b = m.contrast[k];
      for (int t = s; t < end; ++t) {
        a += w[t];
        b += w2[t];
      }
      m.power[k] = a;
      m.contrast[k] = b;
      s = end;
    }
  }

  void finish(const dcestconf& conf, dcblock& out) const {
    const int ns = ns_, nl = nl_;
    double P = 0.0, F = 0.0, Rr = 0.0, Ri = 0.0;
    for (int s = 0; s < ns; ++s) {
      P += p_[static_cast<std::size_t>(s)];
      F += f_[static_cast<std::size_t>(s)];
      Rr += rr_[static_cast<std::size_t>(s)];
      Ri += ri_[static_cast<std::size_t>(s)];
    }
    out.valid = 0;
    out.centroid = 0.0;
    out.contrast = 0.0;
    out.power = 0.0;
    out.noise = 0.0;
    out.meanPower = std::isfinite(P) ? P / (static_cast<double>(ns) * nl) : 0.0;
    out.lag1 = std::isfinite(Rr) && std::isfinite(Ri) ? std::complex<double>(Rr, Ri) : std::complex<double>();
    out.lagTerms = static_cast<int64_t>(ns) * std::max(0, nl - 1);
    if (!(F > 0.0) || !std::isfinite(F)) return;
    const double pm = P / ns;
    const double a = std::hypot(Rr, Ri) / ns;
    if (!(a > 0.0) || !(pm / a < conf.Sthr)) return;
    out.valid = 1;
    out.centroid = std::atan2(Ri, Rr) / kTwoPi;
    out.power = pm;
    out.contrast = static_cast<double>(nl) * ns * F / (P * P);
    out.noise = conf.r1 > 0.0 ? pm - (conf.r0 / conf.r1) * a : 0.0;
  }

  int ns_, nl_;
  std::vector<float> re_, im_, prevRe_, prevIm_, w_, w2_;
  std::vector<double> p_, f_, rr_, ri_;
};

/// Box filter of width w over n values taken `stride` apart: each output is the sum of the
/// inputs from i - w/2 to i + w/2 inside the map, divided by w (edges read lower).
void box_filter(std::vector<float>& map, int count, int n, int stride, int lineStride, int w) {
  std::vector<float> in(static_cast<std::size_t>(n));
  for (int c = 0; c < count; ++c) {
    float* base = map.data() + static_cast<std::size_t>(c) * static_cast<std::size_t>(lineStride);
    for (int i = 0; i < n; ++i) in[static_cast<std::size_t>(i)] = base[static_cast<std::size_t>(i) * stride];
    for (int i = 0; i < n; ++i) {
      float sum = 0.0f;
      for (int k = std::max(0, i - w / 2); k <= std::min(n - 1, i + w / 2); ++k) sum += in[static_cast<std::size_t>(k)];
      base[static_cast<std::size_t>(i) * stride] = sum / static_cast<float>(w);
    }
  }
}

void print_progress(const dcestconf& conf, const char* text) {
  if (conf.progressFlag) std::printf("%s", text);
}

}  // namespace

double dceval(const DopplerPoly& a, double r, double t) {
  const double x = r - a[7];
  const double y = t - a[8];
  return a[0] + a[1] * x + a[2] * y + a[3] * x * y + a[4] * x * x + a[5] * x * x * x + a[6] * x * x * x * x;
}

double bspline3(double x) {
  const double ax = std::fabs(x);
  if (ax <= 1.0) return ax * ax * ax / 2.0 + 2.0 / 3.0 - x * x;
  if (ax < 2.0) return x * x + 4.0 / 3.0 - 2.0 * ax - ax * ax * ax / 6.0;
  return 0.0;
}

void blockstats(const dcestconf& conf, std::span<const fcomplex> block, dcblock& out) {
  const int ns = conf.Blocks, nl = conf.Blockl;
  if (ns < 1 || nl < 1 || block.size() < static_cast<std::size_t>(ns) * static_cast<std::size_t>(nl)) {
    out.valid = 0;
    return;
  }
  BlockPass pass(ns, nl);
  pass.run(conf, block.data(), ns, out, nullptr, 0, 0);
}

int setprocbuf(dcestconf& conf, dcimage& image) {
  base::Frame frame("setprocbuf");
  if (conf.Blocks < 1 || conf.Blockl < 1 || conf.Patchs < 1 || conf.Patchl < 1)
    return rejected("Block and patch sizes must be positive");
  if (conf.Blockl % conf.Patchl != 0) return rejected("Blockl must be a multiple of patchl!");
  if (conf.Blocks % conf.Patchs != 0) return rejected("Blocks must be a multiple of patchs!");
  if (image.samples < 1 || image.lines < 1) return rejected("The image to estimate the Doppler centroid on is empty");
  const int nc = image.samples / conf.Blocks;
  const int nr = image.lines / conf.Blockl;
  if (nc < 1 || nr < 1) return rejected("The image is smaller than one Doppler estimation block");
  const double rowBytes = static_cast<double>(conf.Blockl) * image.samples * 8.0;
  const double m = std::trunc(static_cast<double>(conf.Memory) / rowBytes);
  if (m < 1.0) {
    std::printf("\nNot enough memory to perform DC estimation process.\nCheck Memory parameter in processing.conf file\n");
    return 1;
  }
  if (conf.Flag_incore &&
      conf.coreMatrix.size() < static_cast<std::size_t>(image.samples) * static_cast<std::size_t>(image.lines))
    return rejected("The core matrix is smaller than the image description");
  conf.blocksAcross = nc;
  conf.blockRows = nr;
  conf.gridBlocks = nc * nr;
  conf.rowsInMemory = static_cast<int32_t>(std::min(m, static_cast<double>(nr)));
  conf.patchesAcross = conf.Blocks * nc / conf.Patchs;
  conf.patchesDown = conf.Blockl * nr / conf.Patchl;
  conf.blocks.assign(static_cast<std::size_t>(conf.gridBlocks), dcblock{});
  const std::size_t patches = static_cast<std::size_t>(conf.patchesAcross) * static_cast<std::size_t>(conf.patchesDown);
  conf.powerMap.assign(patches, 0.0f);
  conf.contrastMap.assign(patches, 0.0f);
  conf.mlbfBlocks.clear();
  conf.wdarBlocks.clear();
  // Trailing lines that do not fill a block row are not used.
  image.lines = conf.Blockl * nr;
  return 0;
}

int getnadcbins(dcestconf& conf, const dcimage& image) {
  base::Frame frame("getnadcbins");
  if (conf.blocks.size() != static_cast<std::size_t>(conf.gridBlocks) || conf.gridBlocks < 1)
    return rejected("getnadcbins: the processing buffer is not set");
  if (conf.progressFlag) base::waitbar_open("Doppler Centroid Estimation");
  const int nc = conf.blocksAcross;
  const int nr = conf.blockRows;
  const int64_t samples = image.samples;
  std::vector<fcomplex> rowBuffer;
  for (int firstRow = 0; firstRow < nr; firstRow += conf.rowsInMemory) {
    const int rows = std::min(conf.rowsInMemory, nr - firstRow);
    const fcomplex* chunk = nullptr;
    if (conf.Flag_incore) {
      chunk = conf.coreMatrix.data() + static_cast<int64_t>(firstRow) * conf.Blockl * samples;
    } else {
      if (int st = frame.check(read_rows(image.path, samples, static_cast<int64_t>(firstRow) * conf.Blockl,
                                         static_cast<int64_t>(rows) * conf.Blockl, rowBuffer)))
        return st;
      chunk = rowBuffer.data();
    }
    const int count = rows * nc;
    BlockPass::Maps maps;
    maps.power = conf.powerMap.data();
    maps.contrast = conf.contrastMap.data();
    maps.across = conf.patchesAcross;
    maps.patchs = conf.Patchs;
    maps.patchl = conf.Patchl;
    maps.area = static_cast<float>(conf.Patchs) * static_cast<float>(conf.Patchl);
    // Each patch lies in exactly one block, so blocks may be added concurrently to the maps.
    base::ParallelFailure failure;
#pragma omp parallel
    {
      std::optional<BlockPass> pass;
      failure.run([&] { pass.emplace(conf.Blocks, conf.Blockl); });
#pragma omp for schedule(static)
      for (int k = 0; k < count; ++k) failure.run([&] {
        const int r = k / nc;
        const int c = k - r * nc;
        const int left = c * conf.Blocks;
        const int top = (firstRow + r) * conf.Blockl;
        dcblock& b = conf.blocks[static_cast<std::size_t>(firstRow + r) * static_cast<std::size_t>(nc) +
                                 static_cast<std::size_t>(c)];
        pass->run(conf, chunk + static_cast<int64_t>(r) * conf.Blockl * samples + left, samples, b, &maps, left, top);
        b.sample = left + conf.Blocks / 2;
        b.line = top + conf.Blockl / 2;
      });
    }
    failure.rethrow();
    if (conf.progressFlag) base::waitbar_update(100.0 * (firstRow + rows) / nr);
  }
  print_progress(conf, "done.\n");
  return frame.check(getcontrast(conf));
}

int getcontrast(dcestconf& conf) {
  base::Frame frame("getcontrast");
  const int across = conf.patchesAcross;
  const int down = conf.patchesDown;
  if (across < 1 || down < 1) return 0;
  const int wr = (conf.Blocks / 4) / conf.Patchs + 1;
  const int wa = (conf.Blockl / 4) / conf.Patchl + 1;
  for (auto* map : {&conf.powerMap, &conf.contrastMap}) {
    box_filter(*map, down, across, 1, across, wr);
    box_filter(*map, across, down, across, 1, wa);
  }
  const int g = conf.Dswst / conf.Patchs;
  for (int y = 0; y < down; ++y)
    for (int x = 0; x < across; ++x) {
      const std::size_t k = static_cast<std::size_t>(y) * static_cast<std::size_t>(across) + static_cast<std::size_t>(x);
      const float first = conf.powerMap[k];
      conf.contrastMap[k] = (first > 0.0f && x > g && x < across - g) ? conf.contrastMap[k] / (first * first) : 0.0f;
    }
  return 0;
}

int getnadcpoly(dcimage& image, dcestconf& conf, DopplerPoly& poly) {
  base::Frame frame("getnadcpoly");
  poly.fill(0.0);
  poly[7] = image.rangeTimeOrigin;
  poly[8] = image.azimuthTimeOrigin;
  conf.ambiguity = 0;
  conf.decision = AmbiguityDecision::None;
  conf.wdarOffset = kNoWdarOffset;
  conf.mlbfStats = {};
  conf.wdarStats = {};
  if (!(image.prf > 0.0) || !(conf.AnLen > 0.0) || !(conf.fs > 0.0) || !(conf.carrier > 0.0) ||
      !std::isfinite(image.platformSpeed))
    return rejected("getnadcpoly: PRF, antenna length, sampling rate and carrier must be positive");

  conf.gates = CentroidGates{};
  if (conf.Blocks > 0 && conf.Blockl > 0 && (image.samples < conf.Blocks || image.lines < conf.Blockl)) {
    // Too small a scene for one block: the geometry is all there is to go by.
    conf.gates.source = CentroidSource::Geometry;
    conf.gates.failed = "block grid";
    conf.gates.reason = "the image (" + std::to_string(image.lines) + " lines of " + std::to_string(image.samples) +
                        " samples) is smaller than one estimation block";
    base::report(base::kReportWarning, "Doppler centroid: " + conf.gates.reason + ": the geometric centroid applied");
    conf.decision = AmbiguityDecision::GeometryFallback;
    poly[0] = conf.geometricCentroid;
    return 0;
  }
  print_progress(conf, "* Setting Processable Buffer\n");
  if (int st = frame.check(setprocbuf(conf, image))) return st;

  print_progress(conf, "* Calculating first two samples of theoretic autocorrelation\n");
  conf.r0 = bspline3(0.0);
  conf.r1 = bspline3(2.0 * image.platformSpeed / (conf.AnLen * image.prf));

  print_progress(conf, "* Getting bins for polynomial estimation\n");
  if (int st = frame.check(getnadcbins(conf, image))) return st;

  print_progress(conf, "* Polynomial estimation\n");
  if (int st = frame.check(dcnapoly(image, conf, poly))) return st;
  if (conf.progressFlag) {
    static constexpr const char* kLabels[7] = {"Constant term [Hz]",
                                               "I range [Hz/s]",
                                               "I azimuth [Hz/s]",
                                               "I range * I azimuth [Hz/s^2]",
                                               "II range [Hz/s^2]",
                                               "III range [Hz/s^3]",
                                               "IV range [Hz/s^4]"};
    for (int i = 0; i < 7; ++i) std::printf("%s: %e\n", kLabels[i], poly[static_cast<std::size_t>(i)]);
  }
  if (!conf.outputDir.empty()) {
    if (int st = frame.check(infodump(conf, image, poly, "DCEST_resume.txt"))) return st;
  }
  return 0;
}

}  // namespace sar::doppler

// Entry of the estimator and the statistics of the block grid: fractional centroid (phase of the
// lag-one azimuth autocorrelation), power, noise, contrast, and the patch maps of power from
// which the contrast map is made.
#include <algorithm>
#include <cmath>
#include <cstdio>
#include <fstream>
#include <numbers>
#include <string>
#include <vector>

#include "base/diagnostics.hpp"
#include "base/run_services.hpp"
#include "doppler/dcest.hpp"

namespace sar::doppler {
namespace {

constexpr double kTwoPi = 2.0 * std::numbers::pi;

int rejected(const char* text) {
  base::report(base::kReportError, text);
  return 10;
}

bool finite(const fcomplex& v) { return std::isfinite(v.real()) && std::isfinite(v.imag()); }

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

/// Copies one block out of a matrix of `pitch` samples a row, with non-finite samples set to 0
/// (lines filled with NaN by the extraction carry no signal).
void copy_block(const fcomplex* topLeft, int64_t pitch, int blocks, int blockl, std::vector<fcomplex>& block) {
  block.resize(static_cast<std::size_t>(blocks) * static_cast<std::size_t>(blockl));
  for (int l = 0; l < blockl; ++l) {
    const fcomplex* src = topLeft + static_cast<int64_t>(l) * pitch;
    fcomplex* dst = block.data() + static_cast<std::size_t>(l) * static_cast<std::size_t>(blocks);
    for (int s = 0; s < blocks; ++s) dst[s] = finite(src[s]) ? src[s] : fcomplex(0.0f, 0.0f);
  }
}

/// Adds a block's power and squared power to the patch maps. Each patch lies in exactly one
/// block, so blocks may be added concurrently and in any order.
void add_to_patch_maps(dcestconf& conf, std::span<const fcomplex> block, int left, int top) {
  const float area = static_cast<float>(conf.Patchs) * static_cast<float>(conf.Patchl);
  for (int l = 0; l < conf.Blockl; ++l) {
    const int64_t rowBase = static_cast<int64_t>((top + l) / conf.Patchl) * conf.patchesAcross;
    const fcomplex* row = block.data() + static_cast<std::size_t>(l) * static_cast<std::size_t>(conf.Blocks);
    for (int s = 0; s < conf.Blocks; ++s) {
      const std::size_t k = static_cast<std::size_t>(rowBase + (left + s) / conf.Patchs);
      const float w = std::norm(row[s]);
      conf.powerMap[k] += w / area;
      conf.contrastMap[k] += w * w / area;
    }
  }
}

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
  const int ns = conf.Blocks;
  const int nl = conf.Blockl;
  // Per range bin sums in double, in line order; the bins are then added in range order, so
  // a block's result does not depend on who computes it.
  std::vector<double> p(static_cast<std::size_t>(ns), 0.0), f(p.size(), 0.0), rr(p.size(), 0.0), ri(p.size(), 0.0);
  for (int l = 0; l < nl; ++l) {
    const fcomplex* row = block.data() + static_cast<std::size_t>(l) * static_cast<std::size_t>(ns);
    const fcomplex* next = l + 1 < nl ? row + ns : nullptr;
    for (int s = 0; s < ns; ++s) {
      const double xr = row[s].real(), xi = row[s].imag();
      const double w = xr * xr + xi * xi;
      p[static_cast<std::size_t>(s)] += w;
      f[static_cast<std::size_t>(s)] += w * w;
      if (next) {
        const double yr = next[s].real(), yi = next[s].imag();
        rr[static_cast<std::size_t>(s)] += xr * yr + xi * yi;  // conj(x) y
        ri[static_cast<std::size_t>(s)] += xr * yi - xi * yr;
      }
    }
  }
  double P = 0.0, F = 0.0, Rr = 0.0, Ri = 0.0;
  for (std::size_t s = 0; s < p.size(); ++s) {
    P += p[s];
    F += f[s];
    Rr += rr[s];
    Ri += ri[s];
  }
  out.valid = 0;
  out.centroid = 0.0;
  out.contrast = 0.0;
  out.power = 0.0;
  out.noise = 0.0;
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
#pragma omp parallel
    {
      std::vector<fcomplex> block;
#pragma omp for schedule(static)
      for (int k = 0; k < count; ++k) {
        const int r = k / nc;
        const int c = k - r * nc;
        const int left = c * conf.Blocks;
        const int topInChunk = r * conf.Blockl;
        copy_block(chunk + static_cast<int64_t>(topInChunk) * samples + left, samples, conf.Blocks, conf.Blockl, block);
        dcblock& b = conf.blocks[static_cast<std::size_t>(firstRow + r) * static_cast<std::size_t>(nc) +
                                 static_cast<std::size_t>(c)];
        blockstats(conf, block, b);
        b.sample = left + conf.Blocks / 2;
        b.line = (firstRow + r) * conf.Blockl + conf.Blockl / 2;
        add_to_patch_maps(conf, block, left, (firstRow + r) * conf.Blockl);
      }
    }
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

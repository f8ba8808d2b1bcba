// PRF ambiguity of the centroid: choice of the blocks for the two estimators from the contrast
// map, their trimmed statistics and the decision between them and the orbit geometry.
#include <algorithm>
#include <bit>
#include <cmath>
#include <cstdint>
#include <cstdio>
#include <fstream>
#include <numeric>
#include <string>
#include <vector>

#ifdef _OPENMP
#include <omp.h>
#endif

#include "base/diagnostics.hpp"
#include "base/parallel.hpp"
#include "doppler/dcest.hpp"

namespace sar::doppler {
namespace {

constexpr int kHistBins = 1024;

void round_stats(ambstats& s, std::span<const double> values, double low, double high) {
  double sum = 0.0, sum2 = 0.0;
  int n = 0;
  for (double v : values)
    if (v >= low && v <= high) {
      sum += v;
      sum2 += v * v;
      ++n;
    }
  s.count = n;
  if (n > 0) {
    s.mean = sum / n;
    s.std = std::sqrt(std::max(0.0, sum2 / n - s.mean * s.mean));
  }
}

}  // namespace

bool agreeing(const ambstats& s, double varthr) {
  // Trimming up to 45 % from each end finds a tight core in any set, noise included; the core
  // must also hold a quarter of the votes, and four at least, to count as an answer (a few
  // random votes agree by chance more often than a handful do).
  return s.count >= std::max(4, (s.total + 3) / 4) && s.std < varthr;
}

int make_hist(std::span<const double> values, double& step, double& minimum, int bins, std::vector<int>& counts) {
  counts.assign(static_cast<std::size_t>(std::max(bins, 1)), 0);
  step = 0.0;
  minimum = 0.0;
  bool any = false;
  float lo = 0.0f, hi = 0.0f;
  for (double v : values) {
    if (!std::isfinite(v)) continue;
    const float f = static_cast<float>(v);
    lo = any ? std::min(lo, f) : f;
    hi = any ? std::max(hi, f) : f;
    any = true;
  }
  if (!any) return 0;
  minimum = lo;
  // A constant input (step 0) has a single occupied bin.
  const float fstep = bins > 1 ? (hi - lo) / static_cast<float>(bins - 1) : 0.0f;
  step = fstep;
  for (double v : values) {
    if (!std::isfinite(v)) continue;
    int bin = 0;
    if (fstep > 0.0f) {
      const float q = (static_cast<float>(v) - lo) / fstep;
      bin = static_cast<int>(std::floor(q + 0.5f));
      bin = std::clamp(bin, 0, bins - 1);
    }
    ++counts[static_cast<std::size_t>(bin)];
  }
  return 0;
}

int getpercentile(std::span<const double> values, double trim, double& low, double& high) {
  double step = 0.0, minimum = 0.0;
  std::vector<int> counts;
  make_hist(values, step, minimum, kHistBins, counts);
  const double n = static_cast<double>(values.size());
  if (n <= 0.0 || step == 0.0) {
    low = high = minimum;
    return 0;
  }
  // Counted in whole values: ten sums of 0.01 fall short of 0.1 in floating point.
  const double goal = trim * n - 1e-9;
  int64_t lowCount = 0, highCount = 0;
  int i = 0, j = 0;
  while (lowCount < goal && i < kHistBins) lowCount += counts[static_cast<std::size_t>(i++)];
  while (highCount < goal && j < kHistBins) highCount += counts[static_cast<std::size_t>(kHistBins - 1 - j++)];
  if (static_cast<double>(lowCount + highCount) >= n) {
    low = minimum;
    high = (kHistBins - 1) * step + minimum;
  } else {
    // Bin k covers (k - 0.5) step .. (k + 0.5) step above the minimum.
    low = (i - 0.5) * step + minimum;
    high = (kHistBins - 0.5 - j) * step + minimum;
  }
  return 0;
}

ambstats trimmed_stats(std::span<const double> values, double varthr) {
  ambstats last;
  last.total = static_cast<int32_t>(values.size());
  if (values.empty()) return last;
  round_stats(last, values, -HUGE_VAL, HUGE_VAL);
  double sd = varthr + 1.0;
  // Trims of 5 %, 10 %, ... 45 % from each end until the spread is acceptable.
  for (int k = 1; k <= 9 && sd > varthr; ++k) {
    double low = 0.0, high = 0.0;
    getpercentile(values, 0.05 * k, low, high);
    ambstats s = last;
    round_stats(s, values, low, high);
    if (s.count < 1) break;  // an emptied set keeps the last statistics
    last = s;
    sd = s.std;
  }
  return last;
}

int dcnastd(dcestconf& conf) {
  std::vector<double> m, w;
  // An MLBF estimate votes only when its beat peak stands Kthr times above the rest of the
  // beat spectrum: blocks without a dominant scatterer give a flat spectrum and a random peak.
  for (const auto& b : conf.mlbfBlocks)
    for (std::size_t i = 0; i < b.estimates.size(); ++i)
      if (i < b.quality.size() && b.quality[i] >= conf.Kthr) m.push_back(b.estimates[i]);
  for (const auto& b : conf.wdarBlocks) w.push_back(b.estimate);
  conf.mlbfStats = trimmed_stats(m, conf.Varthr);
  conf.wdarStats = trimmed_stats(w, conf.Varthr);
  // The quorum is a share of the votes cast: estimates that did not vote say nothing against
  // those that did (an unsteered scene with few bright places casts few votes, all right).
  return 0;
}

int sel_no_overlap(std::vector<std::array<int, 2>>& points, std::size_t first, int width, int height, int bw, int bh) {
  const int hw = bw / 2, hh = bh / 2;
  int kept = 0;
  for (std::size_t i = first; i < points.size(); ++i) {
    auto& p = points[i];
    bool drop = p[0] - hw < 0 || p[1] - hh < 0 || p[0] - hw + bw > width || p[1] - hh + bh > height;
    for (std::size_t k = 0; k < i && !drop; ++k) {
      const auto& q = points[k];
      if (q[0] < 0) continue;
      drop = std::abs(q[0] - p[0]) < bw && std::abs(q[1] - p[1]) < bh;
    }
    if (drop) {
      p[0] = -1;
    } else {
      ++kept;
    }
  }
  return kept;
}

int topNpoints(std::span<const float> map, int width, int height, int N, int bw, int bh,
               std::vector<std::array<int, 2>>& points) {
  points.clear();
  if (N < 1 || width < 1 || height < 1) return 0;
  std::vector<int> order;
  for (std::size_t k = 0; k < map.size() && k < static_cast<std::size_t>(width) * static_cast<std::size_t>(height); ++k)
    if (map[k] > 0.0f) order.push_back(static_cast<int>(k));
  // Highest values first; equal values in map order, so the choice is reproducible.
  std::stable_sort(order.begin(), order.end(), [&](int a, int b) { return map[static_cast<std::size_t>(a)] > map[static_cast<std::size_t>(b)]; });
  std::vector<std::array<int, 2>> cand;
  int accepted = 0;
  for (std::size_t start = 0; start < order.size() && accepted < N; start += static_cast<std::size_t>(N)) {
    const std::size_t first = cand.size();
    for (std::size_t k = start; k < std::min(order.size(), start + static_cast<std::size_t>(N)); ++k) {
      const int y = order[k] / width;
      cand.push_back({order[k] - y * width, y});
    }
    accepted += sel_no_overlap(cand, first, width, height, bw, bh);
  }
  for (const auto& p : cand)
    if (p[0] >= 0 && static_cast<int>(points.size()) < N) points.push_back(p);
  return static_cast<int>(points.size());
}

namespace {

bool block_inside(const dcestconf& conf, const dcimage& image, int firstLine, int firstSample) {
  return firstLine >= 0 && firstSample >= 0 && static_cast<int64_t>(firstLine) + conf.Blockl <= image.lines &&
         static_cast<int64_t>(firstSample) + conf.Blocks <= image.samples;
}

#if defined(__GNUC__) && defined(__x86_64__) && !defined(__SANITIZE_ADDRESS__)
#define SAR_COPY_KERNEL [[gnu::target_clones("avx512f", "avx2", "default")]]
#else
#define SAR_COPY_KERNEL
#endif

/// Copies n samples; a sample with a part that is not finite (all exponent bits set) becomes 0.
SAR_COPY_KERNEL void copy_finite(const fcomplex* __restrict src, fcomplex* __restrict dst, int n) {
  constexpr std::uint32_t kExponent = 0x7f800000u;
  for (int s = 0; s < n; ++s) {
    const std::uint32_t re = std::bit_cast<std::uint32_t>(src[s].real());
    const std::uint32_t im = std::bit_cast<std::uint32_t>(src[s].imag());
    const std::uint32_t keep = ((re & kExponent) == kExponent || (im & kExponent) == kExponent) ? 0u : ~0u;
    dst[s] = fcomplex(std::bit_cast<float>(re & keep), std::bit_cast<float>(im & keep));
  }
}

/// Copies a block that lies inside the core matrix; non-finite samples become 0.
void copy_core_block(const dcestconf& conf, const dcimage& image, int firstLine, int firstSample,
                     std::vector<fcomplex>& block) {
  const int ns = conf.Blocks, nl = conf.Blockl;
  block.resize(static_cast<std::size_t>(ns) * static_cast<std::size_t>(nl));
  const int64_t samples = image.samples;
  for (int l = 0; l < nl; ++l) {
    const fcomplex* src = conf.coreMatrix.data() + (static_cast<int64_t>(firstLine) + l) * samples + firstSample;
    copy_finite(src, block.data() + static_cast<std::size_t>(l) * static_cast<std::size_t>(ns), ns);
  }
}

/// Runs an estimator on n blocks, spread over the OpenMP threads (each block is computed alone,
/// so the results do not depend on the thread count). Blocks that come from a file are read on
/// the calling thread, which alone may report, a few per thread at a time (`fromFile`); blocks
/// of the core matrix are only checked there and copied by the thread that estimates them,
/// all in one go. The block headers (`title`, with the block's number and n) and the
/// estimator's messages come out in block order, as from a run of one block after the other,
/// and the run stops at the first failing block with its status. `read(i, block)` gives a
/// status; `estimate(i, block, own, log)` likewise, with `own` a buffer of its thread.
template <class Read, class Estimate>
int run_blocks(int n, const char* title, bool fromFile, Read read, Estimate estimate) {
  int threads = 1;
#ifdef _OPENMP
  threads = omp_get_max_threads();
#endif
  const int batch = std::max(1, fromFile ? 2 * threads : n);
  std::vector<std::vector<fcomplex>> blocks(static_cast<std::size_t>(fromFile ? batch : 1));
  std::vector<std::string> logs(static_cast<std::size_t>(batch));
  std::vector<int> status(static_cast<std::size_t>(batch), 0);
  auto slot = [&](int k) -> std::vector<fcomplex>& { return blocks[fromFile ? static_cast<std::size_t>(k) : 0]; };
  for (int first = 0; first < n; first += batch) {
    const int count = std::min(batch, n - first);
    int ready = count, readStatus = 0;
    for (int k = 0; k < count; ++k) {
      if (int st = read(first + k, slot(k))) {
        ready = k;
        readStatus = st;
        break;
      }
    }
    base::ParallelFailure failure;
#pragma omp parallel if (ready > 1)
    {
      std::vector<fcomplex> own;
#pragma omp for schedule(dynamic, 1)
      for (int k = 0; k < ready; ++k) failure.run([&] {
        const std::size_t i = static_cast<std::size_t>(k);
        logs[i].clear();
        status[i] = estimate(first + k, slot(k), own, logs[i]);
      });
    }
    failure.rethrow();
    for (int k = 0; k < ready; ++k) {
      std::printf(title, first + k + 1, n);
      std::fputs(logs[static_cast<std::size_t>(k)].c_str(), stdout);
      if (int st = status[static_cast<std::size_t>(k)]) return st;
    }
    if (ready < count) {
      std::printf(title, first + ready + 1, n);
      return readStatus;
    }
  }
  return 0;
}

}  // namespace

int read_block(const dcestconf& conf, const dcimage& image, int firstLine, int firstSample,
               std::vector<fcomplex>& block) {
  const int ns = conf.Blocks, nl = conf.Blockl;
  if (!block_inside(conf, image, firstLine, firstSample)) {
    base::report(base::kReportError, "read_block: the block lies outside the image");
    return 10;
  }
  if (conf.Flag_incore) {
    copy_core_block(conf, image, firstLine, firstSample, block);
    return 0;
  }
  block.assign(static_cast<std::size_t>(ns) * static_cast<std::size_t>(nl), fcomplex(0.0f, 0.0f));
  const int64_t samples = image.samples;
  std::ifstream in(image.path, std::ios::binary);
  if (!in) {
    base::report(base::kReportError, "Cannot open the range-compressed file " + image.path);
    return 2;
  }
  for (int l = 0; l < nl; ++l) {
    const int64_t offset = ((static_cast<int64_t>(firstLine) + l) * samples + firstSample) * 8;
    in.seekg(static_cast<std::streamoff>(offset));
    in.read(reinterpret_cast<char*>(block.data() + static_cast<std::size_t>(l) * static_cast<std::size_t>(ns)),
            static_cast<std::streamsize>(ns) * 8);
    if (!in) {
      base::report(base::kReportError, "The range-compressed file is shorter than its description: " + image.path);
      return 2;
    }
  }
  for (auto& v : block)
    if (!std::isfinite(v.real()) || !std::isfinite(v.imag())) v = fcomplex(0.0f, 0.0f);
  return 0;
}

int bestblocksproc(dcestconf& conf, const dcimage& image, std::span<const double> coef) {
  base::Frame frame("bestblocksproc");
  auto corner = [&](int sample, int line, int& top, int& left) {
    top = std::clamp(line - conf.Blockl / 2, 0, std::max(0, image.lines - conf.Blockl));
    left = std::clamp(sample - conf.Blocks / 2, 0, std::max(0, image.samples - conf.Blocks));
  };
  // A block of the core matrix is copied by the thread that estimates it; a file is read on
  // this thread.
  const bool fromFile = !conf.Flag_incore;
  auto read = [&](int sample, int line, std::vector<fcomplex>& block) {
    int top = 0, left = 0;
    corner(sample, line, top, left);
    if (!fromFile && block_inside(conf, image, top, left)) return 0;
    return read_block(conf, image, top, left, block);
  };
  auto load = [&](int sample, int line, const std::vector<fcomplex>& read,
                  std::vector<fcomplex>& own) -> const std::vector<fcomplex>& {
    if (fromFile) return read;
    int top = 0, left = 0;
    corner(sample, line, top, left);
    copy_core_block(conf, image, top, left, own);
    return own;
  };
  if (!conf.mlbfBlocks.empty()) {
    if (int st = frame.check(multimlbf_init(conf))) return st;
    if (int st = frame.check(cirpZ_init(conf))) {
      mlbf_free(conf);
      return st;
    }
    const int st = run_blocks(
        static_cast<int>(conf.mlbfBlocks.size()), "\nProcessing MLBF best block %d of %d.\n", fromFile,
        [&](int i, std::vector<fcomplex>& block) {
          const auto& b = conf.mlbfBlocks[static_cast<std::size_t>(i)];
          return read(b.sample, b.line, block);
        },
        [&](int i, const std::vector<fcomplex>& block, std::vector<fcomplex>& own, std::string& log) {
          const auto& b = conf.mlbfBlocks[static_cast<std::size_t>(i)];
          return multimlbf(conf, load(b.sample, b.line, block, own), i, &log);
        });
    mlbf_free(conf);
    if (frame.check(st)) return st;
  }
  if (!conf.wdarBlocks.empty()) {
    if (int st = frame.check(wdar_init(conf))) return st;
    const int st = run_blocks(
        static_cast<int>(conf.wdarBlocks.size()), "\nProcessing WDAR best block %d of %d.\n", fromFile,
        [&](int i, std::vector<fcomplex>& block) {
          const auto& b = conf.wdarBlocks[static_cast<std::size_t>(i)];
          return read(b.sample, b.line, block);
        },
        [&](int i, const std::vector<fcomplex>& block, std::vector<fcomplex>& own, std::string&) {
          auto& b = conf.wdarBlocks[static_cast<std::size_t>(i)];
          return wdar_estimate(conf, load(b.sample, b.line, block, own), dccycles(coef, b.sample, b.line), b.estimate);
        });
    wdar_free(conf);
    if (frame.check(st)) return st;
  }
  return 0;
}

int estambiguity(dcestconf& conf, const dcimage& image, std::span<const double> coef) {
  base::Frame frame("estambiguity");
  conf.wdarOffset = kNoWdarOffset;
  conf.mlbfBlocks.clear();
  conf.wdarBlocks.clear();
  conf.mlbfStats = {};
  conf.wdarStats = {};
  const double centre = dccycles(coef, image.samples / 2, image.lines / 2);
  const int ambG = round_half_away(conf.geometricCentroid / image.prf - centre);
  conf.geometricAmbiguity = ambG;
  std::printf("Geometric computed DC gives ambiguity: %d \n", ambG);
  if (conf.Amb_flag == 0) {
    conf.ambiguity = 0;
    conf.decision = AmbiguityDecision::None;
    return 0;
  }
  if (conf.Amb_flag == 2) {
    conf.ambiguity = ambG;
    conf.decision = AmbiguityDecision::Geometry;
    return 0;
  }
  if (conf.Amb_flag != 1) {
    base::report(base::kReportError, "Amb_flag must be 0, 1 or 2");
    return 10;
  }
  if (conf.Nbestblocks < 1) {
    base::report(base::kReportError, "Nbestblocks must be positive for the ambiguity estimators");
    return 10;
  }
  // Until an estimator decides, the field holds what would be applied.
  conf.ambiguity = ambG;
  conf.decision = AmbiguityDecision::GeometryFallback;

  const int bw = conf.Blocks / conf.Patchs, bh = conf.Blockl / conf.Patchl;
  std::vector<std::array<int, 2>> points;
  topNpoints(conf.contrastMap, conf.patchesAcross, conf.patchesDown, conf.Nbestblocks, bw, bh, points);
  std::printf("\nFound %d optimal blocks for MBLF estimation.\n", static_cast<int>(points.size()));
  for (const auto& p : points) {
    mlbfblock b;
    b.sample = p[0] * conf.Patchs;
    b.line = p[1] * conf.Patchl;
    conf.mlbfBlocks.push_back(std::move(b));
  }
  std::vector<float> inverse(conf.contrastMap);
  for (auto& v : inverse)
    if (v != 0.0f) v = 1.0f / v;
  topNpoints(inverse, conf.patchesAcross, conf.patchesDown, conf.Nwdarblocks, bw, bh, points);
  std::printf("\nFound %d optimal blocks for WDAR estimation.\n", static_cast<int>(points.size()));
  for (const auto& p : points) conf.wdarBlocks.push_back({p[0] * conf.Patchs, p[1] * conf.Patchl, 0.0});

  if (int st = frame.check(bestblocksproc(conf, image, coef))) return st;

  // Absolute centroids less the fractional polynomial: candidate ambiguities.
  for (auto& b : conf.mlbfBlocks) {
    const double p = dccycles(coef, b.sample, b.line);
    for (auto& e : b.estimates) e -= p;
  }
  for (auto& b : conf.wdarBlocks) b.estimate -= dccycles(coef, b.sample, b.line);
  dcnastd(conf);

  const bool mlbfReliable = agreeing(conf.mlbfStats, conf.Varthr);
  const bool wdarReliable = agreeing(conf.wdarStats, conf.Varthr);
  if (!mlbfReliable) {
    if (wdarReliable) {
      conf.ambiguity = round_half_away(conf.wdarStats.mean);
      conf.decision = AmbiguityDecision::Wdar;
      std::printf("\nWDAR results (NO offset correction!): mean %f, std %f , amb %d.\n", conf.wdarStats.mean,
                  conf.wdarStats.std, conf.ambiguity);
      return 0;
    }
    if (conf.wdarBlocks.empty()) {
      std::printf("No WDAR blocks available. \n");
    } else {
      std::printf("\nWDAR results (NO offset correction!): mean %f, std %f , amb %d.\n", conf.wdarStats.mean,
                  conf.wdarStats.std, round_half_away(conf.wdarStats.mean));
    }
    std::printf("Ambiguity estimators cannot decide: geometric ambiguity %d applied.\n", ambG);
    return 1;
  }
  const int ambM = round_half_away(conf.mlbfStats.mean);
  if (conf.wdarBlocks.empty() || conf.wdarStats.count < 1) {
    std::printf("\nNo WDAR blocks available. Offset frequency estimation unavailable. \n");
  } else {
    const double offset = static_cast<float>(conf.wdarStats.mean) - ambM;
    for (auto& b : conf.wdarBlocks) b.estimate -= offset;
    conf.wdarOffset = offset;
    conf.wdarStats.mean -= offset;
    std::printf("\nWDAR results: mean %f, std %f, Nest %d, amb %d.\n", conf.wdarStats.mean, conf.wdarStats.std,
                conf.wdarStats.count, round_half_away(conf.wdarStats.mean));
  }
  conf.ambiguity = ambM;
  conf.decision = AmbiguityDecision::Mlbf;
  std::printf("\nMLBF results: mean %f, std %f, Nest %d, amb %d.\n", conf.mlbfStats.mean, conf.mlbfStats.std,
              conf.mlbfStats.count, ambM);
  return 0;
}

}  // namespace sar::doppler

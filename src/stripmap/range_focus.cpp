#include "stripmap/range_focus.hpp"

#include <algorithm>
#include <cmath>
#include <cstdio>
#include <cstring>
#include <string>

#include <omp.h>

#include "base/convert.hpp"
#include "base/diagnostics.hpp"
#include "base/parallel.hpp"
#include "base/errors.hpp"
#include "stripmap/progress.hpp"
#include "stripmap/raster_files.hpp"
#include "io/line_store.hpp"
#include "dsp/fft.hpp"
#include "base/constants.hpp"

namespace sar::stripmap {

namespace {

using dsp::fcomplex;
namespace ec = base::ec;

constexpr int kRejected = 10;

void reject(const std::string& text) { base::report(base::kReportError, text); }


const std::string& raw_path(const sarpar& par) { return par.raw_file.empty() ? par.extrPath : par.raw_file; }

// Sequential reader of the raw line file: per line a float32 time, then the samples. Its size is
// checked against the lines it must hold before anything is read, so a short file is refused at
// once rather than half processed.
class RawLines {
 public:
  RawLines(const std::string& path, int32_t lines, int32_t samples)
      : samples_(samples), in_(path, static_cast<int64_t>(lines) * (4 + 8 * static_cast<int64_t>(samples)),
                               "raw line file") {}
  // Reads one line's time and samples; the samples land in `row`.
  float read(fcomplex* row) {
    float time = 0.0f;
    in_.read(&time, 4);
    in_.read(row, 8 * static_cast<int64_t>(samples_));
    return time;
  }

 private:
  int32_t samples_;
  InputRaster in_;
};

// Window start offset of a line in samples against the earliest window. A shift outside the
// window span would write past the output line; it means a broken line file.
int line_shift(const sarpar& par, const procparm& proc, const RangeSizes& z, float time, int32_t line,
               int32_t& shift) {
  shift = 0;
  if (!proc.Flag_swstal) return 0;
  const double s = static_cast<double>(base::round_half_away((time - par.nearRangeTime) * par.samplingRate));
  if (!(s >= 0.0 && s <= z.windowSpan)) {
    reject("Range line " + std::to_string(line) +
           base::format_text(": window start %.9g s lies outside the product's window span (%.9g s + %d samples)",
                             static_cast<double>(time), par.nearRangeTime, z.windowSpan));
    return kRejected;
  }
  shift = static_cast<int32_t>(s);
  return 0;
}

// Reads `count` lines into rows of `pitch` samples (the tail of each row zeroed).
int load_lines(RawLines& in, const sarpar& par, const procparm& proc, const RangeSizes& z, int32_t first,
               int32_t count, fcomplex* matrix, int32_t* shifts) {
  for (int32_t i = 0; i < count; ++i) {
    fcomplex* row = matrix + static_cast<int64_t>(i) * z.padded;
    const float t = in.read(row);
    std::fill(row + z.rawSamples, row + z.padded, fcomplex{});
    if (int st = line_shift(par, proc, z, t, first + i, shifts[i])) return st;
  }
  return 0;
}

// The raw lines from the extraction's store into rows of pitch L of `matrix` (the tail of each
// row zeroed). The shifts come first, so a broken line refuses the product before any copying;
// the copies then run in parallel a store chunk at a time. The matrix grows by the chunk's rows
// within its reserved room (so it never moves) and each chunk is freed once copied: the store
// and the matrix never both hold the whole scene.
int load_store(io::LineStore& store, const sarpar& par, const procparm& proc, const RangeSizes& z, dsp::cmatrix& rows,
               int32_t* shifts, OrtogMoments* sums) {
  const int32_t lines = par.lines;
  const std::size_t sampleBytes = 8 * static_cast<std::size_t>(z.rawSamples);
  if (store.line_bytes() != 4 + sampleBytes || store.lines() < lines) {
    reject(base::format_text("Range focusing: the extracted lines in memory (%lld of %zu bytes) do not hold %d lines of %d samples",
                             static_cast<long long>(store.lines()), store.line_bytes(), lines, z.rawSamples));
    return kRejected;
  }
  for (int32_t i = 0; i < lines; ++i) {
    float t = 0.0f;
    std::memcpy(&t, store.line(i), sizeof t);
    if (int st = line_shift(par, proc, z, t, i, shifts[i])) return st;
  }
  const auto step = static_cast<int32_t>(std::min<std::size_t>(store.lines_per_chunk(), static_cast<std::size_t>(lines)));
  rows.clear();
  rows.reserve(static_cast<std::size_t>(lines) * static_cast<std::size_t>(z.padded));
  for (int32_t start = 0; start < lines; start += step) {
    const int32_t stop = std::min(lines, start + step);
    rows.resize(static_cast<std::size_t>(stop) * static_cast<std::size_t>(z.padded));
    fcomplex* matrix = rows.data();
#pragma omp parallel for schedule(static)
    for (int32_t i = start; i < stop; ++i) {
      fcomplex* row = matrix + static_cast<int64_t>(i) * z.padded;
      std::memcpy(static_cast<void*>(row), store.line(i) + 4, sampleBytes);
      std::fill(row + z.rawSamples, row + z.padded, fcomplex{});
      if (sums) sums[i] = ortog_moments(row, z.rawSamples);
    }
    store.release_below(stop);
  }
  return 0;
}

// Moves rows [from, to) of pitch L to pitch V + W in place, the rows before `from` being done:
// row r gets `shift` zeros, its V valid lags, then zeros. Row r's destination ends at
// (r + 1)(V + W) <= (r + 1) L, before the source of any later row, so only the sources of
// earlier rows can lie under it. A run of rows [r, e) whose destinations all end before the
// source of row r, e (V + W) <= r L, can therefore be copied in parallel once the rows before r
// are done; the runs grow geometrically, so only the first rows (about (V + W) / (L - V - W)
// of them) go one by one, through a copy of the line.
void place_row(fcomplex* matrix, int32_t r, const fcomplex* valid, const RangeSizes& z, const int32_t* shifts) {
  fcomplex* dst = matrix + static_cast<int64_t>(r) * z.output;
  const int32_t s = shifts ? shifts[r] : 0;
  std::fill(dst, dst + s, fcomplex{});
  std::copy(valid, valid + z.valid, dst + s);
  std::fill(dst + s + z.valid, dst + z.output, fcomplex{});
}

void repack_rows(fcomplex* matrix, int32_t from, int32_t to, const RangeSizes& z, const int32_t* shifts) {
  std::vector<fcomplex> line(static_cast<std::size_t>(z.valid));
  for (int32_t r = from; r < to;) {
    const int64_t end = static_cast<int64_t>(r) * z.padded / std::max(z.output, 1);
    const int32_t e = static_cast<int32_t>(std::min<int64_t>(to, end));
    if (e - r < 2) {
      const fcomplex* src = matrix + static_cast<int64_t>(r) * z.padded;
      std::copy(src, src + z.valid, line.begin());
      place_row(matrix, r, line.data(), z, shifts);
      ++r;
      continue;
    }
#pragma omp parallel for schedule(static)
    for (int32_t q = r; q < e; ++q) place_row(matrix, q, matrix + static_cast<int64_t>(q) * z.padded, z, shifts);
    r = e;
  }
}

// The quadrature repair's corrections for `rows` raw rows of pitch L (block `block` of the
// stage): their sums in parallel, then the running averages in order. The corrections are
// applied by compress_rows.
std::vector<OrtogCorrection> ortog_plan(const fcomplex* matrix, const RangeSizes& z, int32_t rows, int32_t block,
                                        std::vector<OrtogMoments> moments = {}) {
  if (moments.size() != static_cast<std::size_t>(rows)) {
    moments.assign(static_cast<std::size_t>(rows), OrtogMoments{});
#pragma omp parallel for schedule(static)
    for (int32_t l = 0; l < rows; ++l)
      moments[static_cast<std::size_t>(l)] = ortog_moments(matrix + static_cast<int64_t>(l) * z.padded, z.rawSamples);
  }
  std::vector<OrtogCorrection> corrections(static_cast<std::size_t>(rows));
  ortog_corrections(moments, z.rawSamples, block, corrections);
  return corrections;
}

// Correlates `rows` rows of pitch L with the replica and repacks them at the output pitch:
// row i moves from i L to i (V + W), `shift` zeros first, then the V valid lags, then zeros.
// The repacking runs in row order in place: row i's destination never reaches past its own
// source, so each row is copied out before it can be overwritten.
void compress_rows(fcomplex* matrix, int32_t rows, const RangeSizes& z, const dsp::cvector& replicaSpectrum,
                   const int32_t* shifts, const OrtogCorrection* corrections, int32_t block, int32_t blockLines,
                   int32_t blockCount) {
  if (rows <= 0) return;
  // Forward transform, multiply and inverse run on a few rows at a time while they are in
  // cache, instead of three passes over the whole matrix. A row's bytes do not depend on the
  // batch it is transformed in, so this gives the same samples as whole-matrix transforms.
  constexpr int32_t kGroup = 8;
  dsp::fft_plan forward, backward, forwardTail, backwardTail;
  const int32_t tail = rows % kGroup;
  dsp::fft_makep_c(forward, z.padded, z.padded, kGroup, kGroup, 1, 0, 1);
  dsp::fft_makep_c(backward, z.padded, z.padded, kGroup, kGroup, -1, 0, 1);
  if (tail != 0) {
    dsp::fft_makep_c(forwardTail, z.padded, z.padded, tail, tail, 1, 0, 1);
    dsp::fft_makep_c(backwardTail, z.padded, z.padded, tail, tail, -1, 0, 1);
  }
  const fcomplex* h = replicaSpectrum.data();
  // The quadrature repair of each row rides on the transforms' pass, while the row is in cache.
  const auto correlate = [&](std::span<fcomplex> part, int32_t first, int32_t count) {
    const bool full = count == kGroup;
    if (corrections)
      for (int32_t r = 0; r < count; ++r)
        ortog_apply(part.data() + static_cast<int64_t>(r) * z.padded, z.rawSamples, corrections[first + r]);
    dsp::pfft_c(full ? forward : forwardTail, part);
    for (int32_t r = 0; r < count; ++r) {
      fcomplex* x = part.data() + static_cast<int64_t>(r) * z.padded;
      for (int32_t k = 0; k < z.padded; ++k) {
        const double xr = x[k].real(), xi = x[k].imag();
        const double hr = h[k].real(), hi = h[k].imag();
        x[k] = fcomplex(static_cast<float>(xr * hr - xi * hi), static_cast<float>(xi * hr + xr * hi));
      }
    }
    dsp::pfft_c(full ? backward : backwardTail, part);
  };
  // One aligned group of rows per thread: a row is transformed there and goes straight to its
  // place at the output pitch, which saves the repacking pass over the matrix. That is safe for
  // a window whose destinations all end before its first source (the windows before it being
  // done); the first windows of a matrix are transformed in place and repacked.
  std::vector<dsp::cvector> scratch(static_cast<std::size_t>(std::max(omp_get_max_threads(), 1)));
  base::ParallelFailure failure;
  constexpr int32_t kWindow = 64 * kGroup;  // lines between two progress reports
  for (int32_t start = 0; start < rows; start += kWindow) {
    const int32_t stop = std::min(rows, start + kWindow);
    const int32_t groups = (stop - start + kGroup - 1) / kGroup;
    const bool direct = static_cast<int64_t>(stop) * z.output <= static_cast<int64_t>(start) * z.padded;
#pragma omp parallel for schedule(static)
    for (int32_t g = 0; g < groups; ++g) failure.run([&] {
      const int32_t first = start + g * kGroup;
      const int32_t count = std::min(kGroup, stop - first);
      const auto size = static_cast<std::size_t>(count) * z.padded;
      fcomplex* source = matrix + static_cast<int64_t>(first) * z.padded;
      if (!direct) {
        correlate(std::span<fcomplex>(source, size), first, count);
        return;
      }
      dsp::cvector& own = scratch[static_cast<std::size_t>(omp_get_thread_num())];
      if (own.size() < static_cast<std::size_t>(kGroup) * z.padded) own.resize(static_cast<std::size_t>(kGroup) * z.padded);
      std::copy(source, source + size, own.begin());
      correlate(std::span<fcomplex>(own.data(), size), first, count);
      for (int32_t r = 0; r < count; ++r)
        place_row(matrix, first + r, own.data() + static_cast<int64_t>(r) * z.padded, z, shifts);
    });
    failure.rethrow();
    if (!direct) repack_rows(matrix, start, stop, z, shifts);
    const double done = static_cast<double>(block) * blockLines + stop;
    progress_update(100.0 * done / (static_cast<double>(blockCount) * std::max(blockLines, 1)));
  }
}

// Offset in samples of the replica's first sample from the leading edge of the pulse. The
// nominal replica is sampled symmetrically about the pulse centre, so its first sample lies
// (Tp fs - (n - 1)) / 2 samples into the pulse; correlating with it would put every target that
// much late. Unknown (0) without a nominal pulse length.
double replica_lead(const sarpar& par, const RangeSizes& z) {
  if (!(par.pulse_length > 0.0) || par.resampling_factor > 1) return 0.0;
  const double lead = (par.pulse_length * par.samplingRate - (z.replicaLength - 1)) / 2.0;
  return std::abs(lead) < 1.0 ? lead : 0.0;
}

// Conjugate spectrum of the replica, with the linear phase that moves the correlation peak back
// by the replica's lead, so that output sample k is two-way time t_near + k / fs.
dsp::cvector replica_spectrum(const sarpar& par, const procparm& proc, const RangeSizes& z) {
  dsp::cvector h(static_cast<std::size_t>(z.padded), fcomplex{});
  std::copy(proc.replica.begin(), proc.replica.begin() + z.replicaLength, h.begin());
  dsp::fft_c(z.padded, z.padded, 1, 1, 1, 0, h);
  const double lead = replica_lead(par, z);
  const int L = z.padded;
  for (int k = 0; k < L; ++k) {
    const double f = (k < (L + 1) / 2 ? k : k - L) / static_cast<double>(L);
    const std::complex<double> c = std::conj(std::complex<double>(h[static_cast<std::size_t>(k)])) *
                                   std::polar(1.0, base::kTwoPi * f * lead);
    h[static_cast<std::size_t>(k)] = fcomplex(static_cast<float>(c.real()), static_cast<float>(c.imag()));
  }
  return h;
}

}  // namespace

BlockCounters& block_counters() {
  static BlockCounters counters;
  return counters;
}

int range_sizes(const sarpar& par, const procparm& proc, RangeSizes& z) {
  z = RangeSizes{};
  z.rawSamples = par.samples;
  z.replicaLength = proc.replicaLength;
  if (par.samples <= 0 || par.lines <= 0) {
    reject("Range focusing: the product holds no raw lines");
    return kRejected;
  }
  if (proc.replicaLength <= 0 || static_cast<std::size_t>(proc.replicaLength) > proc.replica.size()) {
    reject("Range focusing: no range reference (replica) for the product");
    return kRejected;
  }
  if (proc.replicaLength > par.samples) {
    reject("Range focusing: the replica (" + std::to_string(proc.replicaLength) + " samples) is longer than a raw line (" +
           std::to_string(par.samples) + " samples)");
    return kRejected;
  }
  if (!(par.samplingRate > 0.0)) {
    reject("Range focusing: no range sampling rate");
    return kRejected;
  }
  const double span = static_cast<double>(base::round_half_away((par.far_range_time - par.nearRangeTime) * par.samplingRate));
  if (!(span >= 0.0 && span < 1e6)) {
    reject(base::format_text("Range focusing: window span of %g samples between %.9g s and %.9g s", span,
                             par.nearRangeTime, par.far_range_time));
    return kRejected;
  }
  z.windowSpan = static_cast<int32_t>(span);
  // A pitch of whole 64-byte units puts every row on the same alignment, so each line's
  // transform gives the same bytes whether it sits in a file-mode block or the core matrix.
  constexpr int32_t kUnit = 8;
  z.padded = dsp::genpow((z.rawSamples + z.windowSpan + kUnit - 1) / kUnit * kUnit, kUnit);
  z.valid = z.rawSamples - z.replicaLength + 1;
  z.output = z.valid + z.windowSpan;
  if (z.padded <= 0) {
    reject("Range focusing: line too long for the transform");
    return kRejected;
  }
  return 0;
}

int init_buffer(const sarpar& par, procparm& proc) {
  base::Frame frame("init_buffer");
  RangeSizes z;
  if (int st = frame.check(range_sizes(par, proc, z))) return st;
  proc.paddedLength = z.padded;
  proc.rangeSamples = z.output;
  proc.lines = par.lines;
  proc.lineShifts.assign(static_cast<std::size_t>(par.lines), 0);
  int st = 0;
  if (proc.rawLines) {
    // The extraction kept the lines in memory: no line file exists.
    // The sums of the quadrature repair are taken while each line is in cache.
    proc.rawSums.assign(proc.Flag_ortog ? static_cast<std::size_t>(par.lines) : 0, OrtogMoments{});
    st = load_store(*proc.rawLines, par, proc, z, proc.matrix, proc.lineShifts.data(),
                    proc.Flag_ortog ? proc.rawSums.data() : nullptr);
    proc.rawLines.reset();
  } else {
    proc.matrix.assign(static_cast<std::size_t>(par.lines) * static_cast<std::size_t>(z.padded), fcomplex{});
    RawLines in(raw_path(par), par.lines, par.samples);
    st = load_lines(in, par, proc, z, 0, par.lines, proc.matrix.data(), proc.lineShifts.data());
  }
  if (st != 0) {
    proc.matrix = dsp::cmatrix();
    proc.lineShifts.clear();
    return frame.check(st);
  }
  return 0;
}

int rangefoc(const sarpar& par, procparm& proc) {
  base::Frame frame("rangefoc");
  RangeSizes z;
  if (int st = frame.check(range_sizes(par, proc, z))) return st;
  const int32_t lines = par.lines;
  const bool core = proc.Flag_incore != 0;
  if (core) {
    if (proc.paddedLength != z.padded || proc.matrix.size() < static_cast<std::size_t>(lines) * z.padded ||
        proc.lineShifts.size() < static_cast<std::size_t>(lines)) {
      reject("Range focusing: the raw matrix is not loaded (init_buffer)");
      return frame.check(kRejected);
    }
    proc.Azblk = lines;
  } else if (proc.Azblk <= 0 || proc.Azblk > lines) {
    reject("Range focusing: block of " + std::to_string(proc.Azblk) + " lines for a product of " +
           std::to_string(lines) + " lines");
    return frame.check(kRejected);
  }
  const int32_t blockLines = proc.Azblk;
  const int32_t full = lines / blockLines;
  const int32_t rest = lines - full * blockLines;
  const int32_t shownBlocks = full + (rest > 0 ? 1 : 0);
  block_counters() = BlockCounters{0, shownBlocks};
  proc.paddedLength = z.padded;
  proc.rangeSamples = z.output;
  proc.lines = lines;

  const dsp::cvector h = replica_spectrum(par, proc, z);
  progress_open("Range Focusing");

  if (core) {
    const std::vector<OrtogCorrection> repair =
        proc.Flag_ortog ? ortog_plan(proc.matrix.data(), z, lines, 0, std::move(proc.rawSums))
                        : std::vector<OrtogCorrection>();
    proc.rawSums = {};
    compress_rows(proc.matrix.data(), lines, z, h, proc.lineShifts.data(), proc.Flag_ortog ? repair.data() : nullptr,
                  0, lines, 1);
    proc.matrix.resize(static_cast<std::size_t>(lines) * z.output);
    block_counters().current = 1;
    progress_update(100.0);
    return 0;
  }

  RawLines in(raw_path(par), lines, par.samples);
  OutputRaster out(par.rgfPath);
  dsp::cvector matrix(static_cast<std::size_t>(blockLines) * z.padded);
  std::vector<int32_t> shifts(static_cast<std::size_t>(blockLines));
  // B full blocks and always a final one, which may be empty.
  for (int32_t b = 0; b <= full; ++b) {
    const int32_t n = b < full ? blockLines : rest;
    block_counters().current = b + 1;
    if (n == 0) continue;
    if (int st = load_lines(in, par, proc, z, b * blockLines, n, matrix.data(), shifts.data())) return frame.check(st);
    const std::vector<OrtogCorrection> repair =
        proc.Flag_ortog ? ortog_plan(matrix.data(), z, n, b) : std::vector<OrtogCorrection>();
    compress_rows(matrix.data(), n, z, h, shifts.data(), proc.Flag_ortog ? repair.data() : nullptr, b, blockLines,
                  shownBlocks);
    out.write(matrix.data(), static_cast<int64_t>(n) * z.output);
  }
  out.commit();
  progress_update(100.0);
  return 0;
}

int dest_buffer(const sarpar& par, procparm& proc) { return dest_buffer(par, proc, {}); }

int dest_buffer(const sarpar& par, procparm& proc, const WrittenLines& written) {
  base::Frame frame("dest_buffer");
  const auto count = static_cast<int64_t>(proc.focusedLines) * proc.focusedSamples;
  if (proc.focusedLines <= 0 || proc.focusedSamples <= 0 || static_cast<int64_t>(proc.matrix.size()) < count) {
    reject("dest_buffer: no focused matrix to write");
    return frame.check(kRejected);
  }
  OutputRaster out(par.slcPath);
  if (!written) {
    out.write(proc.matrix.data(), count);
  } else {
    // A few megabytes at a time, so that the observer reads the lines from the cache.
    constexpr int64_t kRunBytes = int64_t{8} << 20;
    const auto run = static_cast<int32_t>(std::max<int64_t>(1, kRunBytes / (8 * int64_t{proc.focusedSamples})));
    for (int32_t first = 0; first < proc.focusedLines; first += run) {
      const int32_t lines = std::min(run, proc.focusedLines - first);
      const fcomplex* p = proc.matrix.data() + static_cast<int64_t>(first) * proc.focusedSamples;
      out.write(p, static_cast<int64_t>(lines) * proc.focusedSamples);
      written(first, lines, p);
    }
  }
  out.commit();
  proc.matrix = dsp::cmatrix();
  proc.lineShifts = std::vector<int32_t>();
  return 0;
}

int imcutter(const sarpar& par, const procparm& proc, const azimuthconf& az, const cutrect& wanted, cutrect& needed) {
  const double fs = par.samplingRate, prf = par.prf;
  const int32_t hr = az.RangeOverlap, ha = az.AzimuthOverlap;
  needed.azimuthStart = wanted.azimuthStart - az.azimuthShift - ha / prf;
  needed.rangeStart = wanted.rangeStart - az.rangeShift - hr / fs;
  needed.samples = wanted.samples + proc.replicaLength + 2 * hr - 1;
  needed.lines = wanted.lines + 2 * ha;
  const bool ok = needed.rangeStart >= par.nearRangeTime && needed.azimuthStart >= par.azimuthStartTime &&
                  needed.lines / prf + needed.azimuthStart <= par.lines / prf + par.azimuthStartTime &&
                  needed.samples / fs + needed.rangeStart <= par.samples / fs + par.nearRangeTime;
  if (!ok) {
    reject("Requested focused block cannot be obtained from the given extracted data matrix.");
    return kRejected;
  }
  return 0;
}

int imcutter_inv(const sarpar& par, const procparm& proc, const azimuthconf& az, const cutrect& raw, cutrect& focused) {
  const int32_t hr = az.RangeOverlap, ha = az.AzimuthOverlap;
  focused.azimuthStart = raw.azimuthStart + az.azimuthShift + ha / par.prf;
  focused.rangeStart = raw.rangeStart + az.rangeShift + hr / par.samplingRate;
  focused.samples = raw.samples - proc.replicaLength - 2 * hr + 1;
  focused.lines = raw.lines - 2 * ha;
  return 0;
}

}  // namespace sar::stripmap

#include "stripmap/azimuth_focus.hpp"

#include <algorithm>
#include <cmath>
#include <string>
#include <vector>

#include "base/diagnostics.hpp"
#include "base/parallel.hpp"
#include "base/run_services.hpp"
#include "dsp/vsincos.hpp"
#include "stripmap/progress.hpp"
#include "stripmap/range_focus.hpp"
#include "stripmap/raster_files.hpp"

namespace sar::stripmap {

namespace {

constexpr int kRejected = 10;

double poly5(const double p[5], double x) { return p[0] + x * (p[1] + x * (p[2] + x * (p[3] + x * p[4]))); }

double spectrum_ky(const wkparm& wk) {
  const double fd = wk.spectrumCentreFd != 0.0 ? wk.spectrumCentreFd : wk.fd;
  return 2.0 * kPi * fd / wk.V;
}

// Block record of a scene from the job's records; lines and samples of the whole matrix.
wkparm scene_wkparm(const sarpar& par, const procparm& proc, const azimuthconf& az) {
  wkparm wk;
  wk.progressFlag = proc.progressFlag;
  wk.lines = proc.lines;
  wk.samples = proc.rangeSamples;
  wk.carrier = par.carrierFrequency;
  wk.fs = par.samplingRate;
  wk.prf = par.prf;
  wk.rangePadding = 1.0;
  wk.rate = {proc.dopplerRate[0], proc.dopplerRate[1], proc.dopplerRate[4]};
  wk.rateReference = proc.dopplerRate[7];
  wk.nearTime = par.nearRangeTime;
  wk.AntennaLength = az.AntennaLength;
  wk.azimuthWindowH = az.AzimuthWindowHammingParameter;
  wk.rangeWindowH = az.RangeWindowHammingParameter;
  wk.azimuthLookBandwidth = az.AzimuthLookBandwidth;
  wk.rangeLookBandwidth = az.RangeLookBandwidth;
  wk.azimuthTransitionBandwidth = az.AzimuthTransitionBandwidth;
  wk.rangeTransitionBandwidth = az.RangeTransitionBandwidth;
  wk.WhiteningFlag = az.WhiteningFlag;
  wk.PerformInterpolation = az.PerformInterpolation;
  wk.StoltPadding = az.StoltPadding;
  wk.chirpBandwidth = par.chirp_bandwidth;
  return wk;
}

/// Lines an azimuth block must hold before and after the lines it outputs, so that each
/// output line's target has its whole processed aperture (the processed band of Doppler around
/// the centroid, band / |Ka| seconds) inside the block. A target's echoes are centred
/// -(fd / Ka + shift) seconds from the time of its output line: with no azimuth shift that is
/// the beam-centre offset of a squinted beam, which puts the aperture off centre, before the
/// output line for a positive centroid. Taken over the swath's near, middle and far range and
/// the scene's first, middle and last line. Zero margins when the polynomials give no rate.
// A few lines more than the apertures for the compressed response's own extent at the block's
// edges.
constexpr int32_t kApertureGuard = 16;

struct ApertureMargins {
  int32_t lead = 0, trail = 0;
  double offset = 0.0, aperture = 0.0;  ///< lines, where the lead is largest
};

ApertureMargins aperture_margins(const sarpar& par, const procparm& proc, double shift, double band) {
  ApertureMargins m;
  const double prf = par.prf, fs = par.samplingRate;
  const int32_t lines = proc.lines, samples = proc.rangeSamples;
  double lead = 0.0, trail = 0.0;
  bool any = false;
  for (const double x : {0.0, 0.5, 1.0})
    for (const double y : {0.0, 0.5, 1.0}) {
      const double tau = par.nearRangeTime + x * (samples - 1) / fs;
      const double t = par.azimuthStartTime + y * (lines - 1) / prf;
      const double fd = DCeval(proc.dopplerCentroid, tau, t);
      const double ka = DCeval(proc.dopplerRate, tau, t);
      if (!std::isfinite(fd) || !std::isfinite(ka) || ka == 0.0) continue;
      const double offset = -(fd / ka + shift) * prf;
      const double aperture = band * prf / std::fabs(ka);
      if (!any || offset + aperture / 2 > lead) {
        m.offset = offset;
        m.aperture = aperture;
      }
      lead = any ? std::max(lead, offset + aperture / 2) : offset + aperture / 2;
      trail = any ? std::max(trail, aperture / 2 - offset) : aperture / 2 - offset;
      any = true;
    }
  if (!any) return m;
  m.lead = static_cast<int32_t>(std::ceil(std::max(0.0, lead) + kApertureGuard));
  m.trail = static_cast<int32_t>(std::ceil(std::max(0.0, trail) + kApertureGuard));
  return m;
}

}  // namespace

void WKShifts(const wkparm& wk, double& sa, double& sr) {
  double kr0 = 0.0, ky0 = 0.0, kx0 = 0.0;
  WKCentre(wk, kr0, ky0, kx0);
  const double dr = kHalfC / wk.fs;
  sa = wk.PerformInterpolation == 0 ? ky0 * wk.R0 / kx0 : ((wk.samples / 2) * kx0 * dr / kr0 + wk.R0) * ky0 / kx0;
  if (wk.azimuthShift != static_cast<double>(wk.lines)) sa = wk.V * wk.azimuthShift;
  sr = (kr0 / kx0 - 1.0) * wk.R0;
  if (wk.rangeShift != static_cast<double>(wk.samples)) sr = wk.rangeShift * kHalfC;
  sr += wk.R0;
  if (wk.PerformInterpolation == 0) sr += (wk.samples / 2) * (kx0 / kr0 - 1.0) * dr;
}

int focazwk(wkparm& wk, focazwk_result& result) {
  base::Frame frame("focazwk");
  if (int st = frame.check(MyComputeEqPar(wk))) return st;
  int M = 0, Nout = 0;
  double spacing = 0.0, Ni = 0.0;
  if (int st = frame.check(OutImagePar(wk, M, spacing, Ni, Nout))) return st;
  std::vector<double> ky, ky2, rs;
  KyAxis(wk, ky, ky2, rs);
  double sa = 0.0, sr = 0.0;
  WKShifts(wk, sa, sr);
  result.lines = wk.lines;
  result.samples = wk.samples;
  result.rangeSpacing = kHalfC / wk.fs;
  if (wk.rangePadding != 1.0 && wk.PerformInterpolation > 0) {
    result.rangeSpacing = spacing;
    result.samples = Nout;
  }
  result.fd = wk.fd;
  result.azimuthShift = sa / wk.V;
  result.rangeShift = sr * kTwoOverC;
  int st = 0;
  if (wk.PerformInterpolation == 0)
    st = FastWK(wk, ky, ky2, rs, sa, sr);
  else if (wk.PerformInterpolation == 1)
    st = ChirpInterpWK(wk, Ni, M, Nout, ky, ky2, rs, spacing, sa, sr);
  else
    st = LSInterpWK(wk, Ni, M, Nout, ky, ky2, spacing, sa, sr);
  return frame.check(st);
}

int multirg(wkparm& wk, focazwk_result& result, int32_t Sb, int32_t Ov, const double poly[5], double reference) {
  base::Frame frame("multirg");
  const int32_t n = wk.samples, lines = wk.lines;
  const int32_t Sn = Sb - Ov;
  if (Sb <= 0 || Ov < 0 || Sn <= 0 || n <= Ov) {
    base::report(base::kReportError, "Range sub-blocks of " + std::to_string(Sb) + " samples with an overlap of " +
                                         std::to_string(Ov) + " do not fit a block of " + std::to_string(n) + " samples");
    return frame.check(kRejected);
  }
  const double savedNear = wk.nearTime;
  const std::span<fcomplex> block = wk.data;
  const fcomplex* source = wk.input ? wk.input : block.data();
  const int32_t filled = wk.inputLines < 0 ? lines : std::min(wk.inputLines, lines);
  const int32_t keepFirst = wk.keepLines < 0 ? 0 : std::clamp(wk.keepFirst, 0, lines);
  const int32_t keepLines = wk.keepLines < 0 ? lines : std::min(wk.keepLines, lines - keepFirst);
  if (static_cast<int64_t>(std::max(keepLines, 0)) * n > static_cast<int64_t>(block.size())) {
    base::report(base::kReportError, "Range sub-blocks: the output lines do not fit the block");
    return frame.check(kRejected);
  }
  wk.fd = poly5(poly, wk.nearTime - reference + (n / wk.fs) / 2);
  wk.fdNear = poly5(poly, wk.nearTime - reference);
  wk.fdFar = poly5(poly, wk.nearTime - reference + n / wk.fs);
  if (int st = frame.check(MyComputeEqPar(wk))) return st;
  double kr0 = 0.0, ky0 = 0.0, kx0 = 0.0;
  WKCentre(wk, kr0, ky0, kx0);
  const double kd = kx0 - kr0;
  const int32_t Ns = (n - Ov + Sn - 1) / Sn;
  // The work matrix is kept from block to block in the stage's record: a fresh quarter of a
  // gigabyte per block cost its page faults and clearing on every call.
  dsp::cvector& work = wk.subBlock;
  // Rows a multiple of 4 KiB apart would put each column's samples in one cache set, which the
  // column transforms' turns pay for: such rows are padded by one cache line.
  const int32_t Sp = (static_cast<int64_t>(Sb) * 8) % 4096 == 0 ? Sb + 8 : Sb;
  work.resize(static_cast<std::size_t>(Sp) * lines);
  wk.data = work;
  wk.samples = Sb;
  wk.pitch = Sp;
  double accum = 0.0, base = 0.0, previousKxc = 0.0;
  int status = 0;
  for (int32_t sb = 0; sb < Ns && status == 0; ++sb) {
    const int32_t o = sb * Sn;
    const int32_t take = std::min(Sb, n - o);
#pragma omp parallel for schedule(static)
    for (int32_t l = 0; l < lines; ++l) {
      const auto row = work.begin() + static_cast<std::ptrdiff_t>(l) * Sp;
      if (l >= filled) {
        std::fill(row, row + Sb, fcomplex{});
        continue;
      }
      const fcomplex* src = source + static_cast<std::ptrdiff_t>(l) * n + o;
      std::fill(row + take, row + Sb, fcomplex{});
      std::copy(src, src + take, row);
    }
    wk.nearTime = savedNear + o / wk.fs;
    wk.fd = poly5(poly, wk.nearTime - reference + (Sb / wk.fs) / 2);
    wk.fdNear = poly5(poly, wk.nearTime - reference);
    wk.fdFar = poly5(poly, wk.nearTime - reference + Sb / wk.fs);
    if ((status = frame.check(MyComputeEqPar(wk))) != 0) break;
    const double ky = spectrum_ky(wk);
    const double kxc = std::sqrt(kr0 * kr0 - ky * ky);
    if (sb == 0 || wk.PerformInterpolation == 0) {
      wk.rangeShift += (std::cos(block_squint(wk)) - kxc / kr0) * (Ov / 2) / wk.fs;
      accum = 0.0;
      base = (kr0 / kxc - 1.0) * wk.R0 * kTwoOverC - wk.rangeShift;
    } else {
      const double g = previousKxc / kr0;
      accum = (kxc / kr0) * (Ov / 2) / wk.fs + (Sb * (1.0 - g) - (1.0 - g / 2.0) * Ov) / wk.fs + accum;
      wk.rangeShift = (kr0 / kxc - 1.0) * wk.R0 * kTwoOverC - accum - base;
    }
    previousKxc = kxc;
    if ((status = frame.check(focazwk(wk, result))) != 0) break;
    const int32_t back = std::min(Sn, n - o - Ov);
    // The copy back carries the ramp that removes the change of the wavenumber centre
    // (exp(j k_d i dr) over the block's samples i), while the lines are in cache.
    const double step = result.rangeSpacing;
    // The ramp is the same on every line: its phasors are made once per sub-block.
    std::vector<dsp::dcomplex> ramp;
    if (kd != 0.0 && back > 0) {
      std::vector<double> phase(static_cast<std::size_t>(back)), s(phase.size()), c(phase.size());
      for (std::size_t i = 0; i < phase.size(); ++i) phase[i] = kd * ((o + static_cast<int32_t>(i)) * step + 0.0);
      dsp::sincos_n(phase, s, c);
      ramp.resize(phase.size());
      for (std::size_t i = 0; i < ramp.size(); ++i) ramp[i] = dsp::dcomplex(c[i], s[i]);
    }
    base::ParallelFailure failure;
    // Later sub-blocks read columns from o + back on, so the kept lines may overwrite the
    // input in place.
#pragma omp parallel for schedule(static)
    for (int32_t l = 0; l < keepLines; ++l) failure.run([&] {
      const fcomplex* src = work.data() + static_cast<std::ptrdiff_t>(l + keepFirst) * Sp + Ov / 2;
      fcomplex* dst = block.data() + static_cast<std::ptrdiff_t>(l) * n + o;
      std::copy(src, src + back, dst);
      if (!ramp.empty()) dsp::rotate_by(std::span<fcomplex>(dst, ramp.size()), ramp);
    });
    failure.rethrow();
  }
  wk.nearTime = savedNear;
  wk.samples = n;
  wk.pitch = 0;
  wk.data = block;
  return status;
}

int azimuthfoc(const sarpar& par, procparm& proc, const azimuthconf& az) {
  base::Frame frame("azimuthfoc");
  const bool core = proc.Flag_incore != 0;
  const int32_t lines = proc.lines, samples = proc.rangeSamples;
  const int32_t ha = az.AzimuthOverlap, hr = az.RangeOverlap;
  const double fs = par.samplingRate, prf = par.prf;
  if (lines <= 0 || samples <= 0) {
    base::report(base::kReportError, "Azimuth focusing: no range-compressed lines");
    return frame.check(kRejected);
  }
  // A block longer than the scene is the whole scene in one block.
  if (az.LinesInBlock <= 2 * ha || lines <= 2 * ha) {
    base::report(base::kReportError, "Azimuth focusing: blocks of " + std::to_string(az.LinesInBlock) +
                                         " lines with an overlap of " + std::to_string(2 * ha) +
                                         " do not fit a scene of " + std::to_string(lines) + " lines");
    return frame.check(kRejected);
  }
  if (samples <= 2 * hr || az.SamplesInBlock <= 2 * hr) {
    base::report(base::kReportError, "Azimuth focusing: range overlap larger than the block");
    return frame.check(kRejected);
  }
  if (core && proc.matrix.size() < static_cast<std::size_t>(lines) * samples) {
    base::report(base::kReportError, "Azimuth focusing: the range-compressed matrix is not in memory");
    return frame.check(kRejected);
  }

  wkparm wk = scene_wkparm(par, proc, az);
  const auto& dc = proc.dopplerCentroid;
  const double fd = DCeval(dc, (samples / 2) / fs + par.nearRangeTime, (lines / 2) / prf + par.azimuthStartTime);
  wk.fd = fd;
  wk.fdNear = DCeval(dc, par.nearRangeTime, (lines / 2) / prf + par.azimuthStartTime);
  wk.fdFar = DCeval(dc, samples / fs + par.nearRangeTime, (lines / 2) / prf + par.azimuthStartTime);
  wk.spectrumCentreFd = proc.centroidOverride != 0.0 ? proc.centroidOverride : fd;
  if (int st = frame.check(MyComputeEqPar(wk))) return st;
  proc.equivalentVelocity = wk.V;
  proc.azimuthPixelSpacing = wk.V / prf;
  proc.rangePixelSpacing = kHalfC / fs;
  proc.sceneCentroid = fd;
  const double squint = std::asin(kC / par.carrierFrequency * fd / (2.0 * wk.V));

  auto shift_from = [](double w, int32_t count, double rate, double geometric) {
    if (std::abs(w) < count) return w;
    const double d = w > 0 ? w - count : count + w;
    return d / rate + geometric;
  };
  const double R = wk.PerformInterpolation == 0
                       ? wk.R0
                       : wk.R0 + (samples / 2) * (kC / (2.0 * fs)) * std::cos(squint);
  wk.azimuthShift = shift_from(az.azimuthShift, lines, prf, std::tan(squint) * R / wk.V);
  wk.rangeShift = shift_from(az.rangeShift, samples, fs, (1.0 / std::cos(squint) - 1.0) * wk.R0 * kTwoOverC);
  const double sceneRangeShift = wk.rangeShift, sceneAzimuthShift = wk.azimuthShift;

  // Lines each block holds before (lead) and after (trail) the lines it outputs: the configured
  // half overlap, widened where the centroid moves the apertures off centre or the aperture is
  // longer than the overlap, so that no output line's aperture is cut by its block.
  // The processed band: the azimuth window's look band when the window is on, else the PRF.
  const double band = az.AzimuthWindowHammingParameter > 0.0 && az.AzimuthLookBandwidth > 0.0
                          ? std::min(prf, az.AzimuthLookBandwidth)
                          : prf;
  const ApertureMargins need = aperture_margins(par, proc, sceneAzimuthShift, band);
  int32_t lead = std::max(ha, need.lead), trail = std::max(ha, need.trail);
  int32_t Lb = az.LinesInBlock;
  const bool shared = proc.requiredLead >= 0 && proc.requiredTrail >= 0;
  if (shared) {
    // The grid is another image's: its margins, however this image's apertures fall. They
    // differ by the two images' centroid estimates only; the guard lines absorb that.
    if (need.lead > proc.requiredLead + kApertureGuard / 2 || need.trail > proc.requiredTrail + kApertureGuard / 2)
      base::report(base::kReportWarning,
                   "Azimuth focusing: the image shares the line grid of the first image, whose blocks hold " +
                       std::to_string(proc.requiredLead) + " and " + std::to_string(proc.requiredTrail) +
                       " lines around their output where this image's apertures ask for " + std::to_string(need.lead) +
                       " and " + std::to_string(need.trail));
    lead = proc.requiredLead;
    trail = proc.requiredTrail;
  }
  if (lines <= lead + trail) {
    // Not one line of this scene has its whole aperture: focus what there is with the
    // configured overlap, and say that apertures are cut.
    base::report(base::kReportWarning,
                 "Azimuth focusing: a scene of " + std::to_string(lines) + " lines is too short for whole apertures (" +
                     std::to_string(need.lead) + " lines before and " + std::to_string(need.trail) +
                     " after each output line): focused with the configured overlap, apertures cut");
    if (!shared) lead = trail = ha;
  } else if (lead != ha || trail != ha) {
    const int32_t minNet = std::min(512, Lb - 2 * ha);
    if (Lb - lead - trail < minNet) Lb = lead + trail + minNet;
    base::LogPrintf("Azimuth blocks: apertures of %.0f lines centred %.0f lines before their output lines need %d "
                    "lines before and %d after the output of each block (AzimuthOverlap gives %d each): blocks of %d "
                    "lines hold them\n",
                    need.aperture, need.offset, need.lead, need.trail, ha, Lb);
  }
  int32_t Ln = Lb - lead - trail;
  const int32_t full = (lines - lead - trail) / Ln;
  const bool remainder = (lines - lead - trail) % Ln != 0;
  block_counters() = BlockCounters{0, full + (remainder ? 1 : 0)};

  const int32_t So = samples - 2 * hr;

  std::unique_ptr<InputRaster> in;
  std::unique_ptr<OutputRaster> out;
  if (!core) {
    in = std::make_unique<InputRaster>(par.rgfPath, static_cast<int64_t>(lines) * samples * 8, "range-focused file");
    out = std::make_unique<OutputRaster>(par.slcPath);
  }
  // A block whose length has a large prime factor (the last one, as a rule) is padded with
  // zero lines to the next length of factors 2, 3 and 5: its transforms would cost several
  // times those of a whole block. The apertures of its output lines lie inside its data, so the
  // zeros only take the wrap-around of the circular convolution.
  const auto padded_length = [](int32_t n) { return std::max(n, dsp::genpow(n, 1)); };
  dsp::cmatrix block(static_cast<std::size_t>(samples) * padded_length(std::min(Lb, lines)));
  progress_open("Azimuth Focusing");
  focazwk_result result;
  int64_t written = 0;  // focused lines so far (core mode packs them at pitch So)
  for (int32_t b = 0; b <= full; ++b) {
    const int32_t l0 = b * Ln;
    int32_t blockLines = Lb;
    if (b == full) {
      blockLines = lines - Ln * full;
      Ln = blockLines - lead - trail;
    }
    block_counters().current = b + 1;
    if (blockLines <= lead + trail) continue;
    const auto count = static_cast<std::size_t>(blockLines) * samples;
    // Core mode reads the sub-blocks straight from the matrix; the block buffer then only
    // takes the focused lines.
    if (!core) {
      in->seek(static_cast<int64_t>(l0) * samples * 8);
      in->read(block.data(), static_cast<int64_t>(count) * 8);
    }
    const int32_t transformLines = padded_length(blockLines);
    wk.input = core ? proc.matrix.data() + static_cast<std::ptrdiff_t>(l0) * samples : nullptr;
    wk.inputLines = blockLines;
    wk.keepFirst = lead;
    wk.keepLines = Ln;
    const double t = (blockLines / 2 + l0) / prf + par.azimuthStartTime - dc[8];
    const double p[5] = {dc[0] + dc[2] * t, dc[1] + dc[3] * t, dc[4], dc[5], dc[6]};
    wk.lines = transformLines;
    wk.samples = samples;
    wk.data = std::span<fcomplex>(block.data(), static_cast<std::size_t>(transformLines) * samples);
    wk.nearTime = par.nearRangeTime;
    wk.rangeShift = sceneRangeShift;
    wk.azimuthShift = sceneAzimuthShift;
    if (int st = frame.check(multirg(wk, result, az.SamplesInBlock, 2 * hr, p, dc[7]))) return st;
    for (int32_t l = 0; l < Ln; ++l) {
      const fcomplex* src = block.data() + static_cast<std::ptrdiff_t>(l) * samples;
      if (core) {
        std::copy(src, src + So, proc.matrix.begin() + static_cast<std::ptrdiff_t>(written) * So);
      } else {
        out->write(src, So);
      }
      ++written;
    }
    progress_update(100.0 * (b + 1) / std::max(1, full + (remainder ? 1 : 0)));
  }
  if (core) proc.matrix.resize(static_cast<std::size_t>(written) * So);
  if (out) out->commit();
  proc.focusedSamples = So;
  proc.focusedLines = static_cast<int32_t>(written);
  proc.firstSampleTime = par.nearRangeTime - sceneRangeShift + hr / fs;
  proc.firstLineTime = lead / prf + par.azimuthStartTime + sceneAzimuthShift;
  proc.focusedLead = lead;
  proc.focusedTrail = trail;
  proc.outputCentroid = proc.dopplerCentroid;
  proc.outputRate = proc.dopplerRate;
  progress_update(100.0);
  return 0;
}

double getDCshift(const sarpar& par, const procparm& proc, const azimuthconf& az, double& rangeShift,
                  double& azimuthShift) {
  wkparm wk = scene_wkparm(par, proc, az);
  wk.lines = par.lines;
  wk.samples = par.samples;
  wk.nearTime = proc.dopplerRate[7];
  wk.rateReference = proc.dopplerRate[7];
  const auto& dc = proc.dopplerCentroid;
  const double fd = DCeval(dc, (par.samples / 2) / par.samplingRate + dc[7], (par.lines / 2) / par.prf + dc[8]);
  wk.fd = proc.centroidOverride != 0.0 ? proc.centroidOverride : fd;
  rangeShift = azimuthShift = 0.0;
  if (MyComputeEqPar(wk) != 0) return fd;
  const double squint = std::asin(kC / par.carrierFrequency * fd / (2.0 * wk.V));
  if (az.azimuthShift == 0.0 && az.rangeShift == 0.0) {
    const double R = az.PerformInterpolation == 0
                         ? wk.R0
                         : wk.R0 + (kC / (2.0 * par.samplingRate)) * (par.samples / 2) * std::cos(squint);
    azimuthShift = R * std::tan(squint) / wk.V;
    rangeShift = (1.0 / std::cos(squint) - 1.0) * wk.R0 * kTwoOverC;
  }
  return fd;
}

}  // namespace sar::stripmap

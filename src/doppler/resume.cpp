// The account of one estimation, "DCEST_resume.txt", in profile syntax: parameters, the
// estimators' statistics, the polynomial, every block and the ambiguity votes and decision.
#include <algorithm>
#include <cmath>
#include <cstdio>
#include <fstream>
#include <map>
#include <string>
#include <vector>

#include "base/diagnostics.hpp"
#include "base/profile.hpp"
#include "doppler/dcest.hpp"

namespace sar::doppler {
namespace {

std::string key_of(const char* format, int i) {
  char text[64];
  std::snprintf(text, sizeof text, format, i);
  return text;
}

const char* decision_text(AmbiguityDecision d) {
  switch (d) {
    case AmbiguityDecision::None: return "NONE";
    case AmbiguityDecision::Geometry: return "GEOMETRY";
    case AmbiguityDecision::Mlbf: return "MLBF";
    case AmbiguityDecision::Wdar: return "WDAR";
    case AmbiguityDecision::GeometryFallback: return "GEOMETRY_FALLBACK";
  }
  return "NONE";
}

double wrap_cycles(double c) { return c - std::floor(c + 0.5); }

}  // namespace

int infodump(const dcestconf& conf, const dcimage& image, const DopplerPoly& poly, const char* name) {
  if (!name) return 0;
  char path[1024];
  std::snprintf(path, sizeof path, "%s/%s", conf.outputDir.c_str(), name);
  return resumefile(conf, image, poly, path);
}

int resumefile(const dcestconf& conf, const dcimage& image, const DopplerPoly& poly, const std::string& path) {
  base::Frame frame("resumefile");
  {
    std::ofstream truncate(path, std::ios::trunc);
    if (!truncate) {
      base::report(base::kReportError, "Cannot create " + path);
      return 2;
    }
  }
  // Start from the empty file, not from what the profile cache may remember of an older run.
  base::FreeProfile(path);
  using base::WriteMyProfileString;
  using base::WriteProfileDoubleArray;
  auto dbl = [&](const char* sec, const std::string& key, double v) {
    WriteProfileDoubleArray(sec, key, std::span<const double>(&v, 1), path);
  };
  auto num = [&](const char* sec, const std::string& key, int32_t v) {
    base::WriteMyProfileIntArray(sec, key, std::span<const int32_t>(&v, 1), path);
  };

  const char* pp = "Processing_parameters";
  WriteMyProfileString(pp, "Input_image_file", image.path, path);
  WriteMyProfileString(pp, "Result_directory", conf.outputDir, path);
  num(pp, "Record_used", image.lines);
  num(pp, "Samples_in_record", image.samples);
  num(pp, "Total_bins_scanned", conf.gridBlocks);
  num(pp, "Record_in_bins", conf.Blockl);
  num(pp, "Samples_in_bins", conf.Blocks);
  dbl(pp, "Sampling_rate", image.prf);
  dbl(pp, "Platform_velocity", image.platformSpeed);

  const bool estimators = conf.Amb_flag == 1;
  if (estimators) {
    const char* ms = "MLBF_ambiguity_estimation";
    num(ms, "MLBF_bins_processed", static_cast<int32_t>(conf.mlbfBlocks.size()));
    num(ms, "MLBF_estimates_per_bin", conf.Nummlbf);
    dbl(ms, "Normalized_look_bandwidth", conf.Lookbf * conf.RgBand);
    const double s0 = 2.0 * conf.Lookbf * conf.RgBand;
    dbl(ms, "Normalized_look_distance", (s0 + (1.0 - conf.Lookbf) * conf.RgBand) / 2.0);
    num(ms, "Good_MLBF_estimates", conf.mlbfStats.count);
    dbl(ms, "Mean_of_good_MLBF_estimates", conf.mlbfStats.mean);
    dbl(ms, "Std_of_good_MLBF_estimates", conf.mlbfStats.std);
    num(ms, "MLBF_estimated_ambiguity", round_half_away(conf.mlbfStats.mean));

    const char* ws = "WDAR_ambiguity_estimation";
    num(ws, "WDAR_bins_processed", static_cast<int32_t>(conf.wdarBlocks.size()));
    num(ws, "Good_WDAR_estimates", conf.wdarStats.count);
    dbl(ws, "Mean_of_good_WDAR_estimates", conf.wdarStats.mean);
    dbl(ws, "Std_of_good_WDAR_estimates", conf.wdarStats.std);
    if (conf.wdarOffset == kNoWdarOffset) {
      WriteMyProfileString(ws, "WDAR_offset_frequency", "NOT_AVAILABLE", path);
    } else {
      dbl(ws, "WDAR_offset_frequency", conf.wdarOffset);
    }
  }
  if (conf.Amb_flag == 2) num("GEOM_ambiguity_estimation", "Geometry_estimated_ambiguity", conf.geometricAmbiguity);

  const char* ep = "Estimated_polynomial";
  static constexpr const char* kKeys[7] = {"Constant_term_Hz", "Rg_Hz/s",     "Az_Hz/s",      "RgAz_Hz/s",
                                           "RgRgz_Hz/s",       "RgRgRg_Hz/s", "RgRgRgRg_Hz/s"};
  for (std::size_t i = 0; i < 7; ++i) dbl(ep, kKeys[i], poly[i]);
  if (conf.Amb_flag != 0) num(ep, "Estimated_ambiguity", conf.ambiguity);
  dbl(ep, "DC_time_origin_s", poly[7]);

  const char* ap = "Ambiguous_polynomial_estimation";
  WriteMyProfileString(ap, "Legend", "Bin Range Line DC_wrapped Residual SNR Contrast", path);
  for (std::size_t i = 0; i < conf.blocks.size(); ++i) {
    const dcblock& b = conf.blocks[i];
    const double fitted = dceval(poly, poly[7] + b.sample / conf.fs, poly[8] + b.line / image.prf) / image.prf;
    const double row[6] = {static_cast<double>(b.sample), static_cast<double>(b.line), b.centroid,
                           wrap_cycles(b.centroid - fitted), b.snr, b.contrast};
    WriteProfileDoubleArray(ap, key_of("Bin_%1d", static_cast<int>(i)), row, path);
  }

  if (estimators) {
    const char* mb = "MBLF_Ambiguity_estimation";
    const char* me = "MBLF_estimates_in_each_block";
    WriteMyProfileString(mb, "Legend", "Range Line Mean Std", path);
    for (std::size_t i = 0; i < conf.mlbfBlocks.size(); ++i) {
      const mlbfblock& b = conf.mlbfBlocks[i];
      double mean = 0.0, sq = 0.0;
      for (double e : b.estimates) {
        mean += e;
        sq += e * e;
      }
      const double n = std::max<double>(1.0, static_cast<double>(b.estimates.size()));
      mean /= n;
      const double row[4] = {static_cast<double>(b.sample), static_cast<double>(b.line), mean,
                             std::sqrt(std::max(0.0, sq / n - mean * mean))};
      WriteProfileDoubleArray(mb, key_of("MLBF_bin_%1d", static_cast<int>(i)), row, path);
      WriteProfileDoubleArray(me, key_of("MLBF_estimates_in_bin_%1d", static_cast<int>(i)), b.estimates, path);
    }
    const char* wb = "WDAR_Ambiguity_estimation";
    WriteMyProfileString(wb, "Legend", "Range Line Value", path);
    for (std::size_t i = 0; i < conf.wdarBlocks.size(); ++i) {
      const wdarblock& b = conf.wdarBlocks[i];
      const double row[3] = {static_cast<double>(b.sample), static_cast<double>(b.line), b.estimate};
      WriteProfileDoubleArray(wb, key_of("WDAR_bin_%1d", static_cast<int>(i)), row, path);
    }
  }

  // The decision and the votes behind it: every candidate rounded to its ambiguity.
  const char* dp = "Ambiguity_decision";
  WriteMyProfileString(dp, "Decided_by", decision_text(conf.decision), path);
  num(dp, "Applied_ambiguity", conf.ambiguity);
  num(dp, "Geometry_ambiguity", conf.geometricAmbiguity);
  if (estimators) {
    std::map<int, std::array<int32_t, 2>> votes;
    for (const auto& b : conf.mlbfBlocks)
      for (std::size_t i = 0; i < b.estimates.size(); ++i)
        if (i < b.quality.size() && b.quality[i] >= conf.Kthr) ++votes[round_half_away(b.estimates[i])][0];
    for (const auto& b : conf.wdarBlocks) ++votes[round_half_away(b.estimate)][1];
    std::vector<int32_t> amb, mv, wv;
    for (const auto& [a, v] : votes) {
      amb.push_back(a);
      mv.push_back(v[0]);
      wv.push_back(v[1]);
    }
    base::WriteMyProfileIntArray(dp, "Vote_ambiguities", amb, path);
    base::WriteMyProfileIntArray(dp, "MLBF_votes", mv, path);
    base::WriteMyProfileIntArray(dp, "WDAR_votes", wv, path);
  }
  // The plausibility checks of the data estimate and what was applied after them.
  const char* cp = "Centroid_plausibility";
  const auto& g = conf.gates;
  static constexpr const char* kSource[3] = {"FIT", "CONSTANT", "GEOMETRY"};
  WriteMyProfileString(cp, "Applied_centroid", kSource[static_cast<int>(g.source)], path);
  WriteMyProfileString(cp, "Failed_check", g.failed.empty() ? std::string("NONE") : g.failed, path);
  if (!g.reason.empty()) WriteMyProfileString(cp, "Failed_check_detail", g.reason, path);
  dbl(cp, "Noise_floor", g.noiseFloor);
  num(cp, "Signal_blocks", g.signalBlocks);
  if (g.slopeHigh > g.slopeLow) {
    dbl(cp, "Range_slope_Hz/s", g.slopeWorst);
    dbl(cp, "Range_slope_low_Hz/s", g.slopeLow);
    dbl(cp, "Range_slope_high_Hz/s", g.slopeHigh);
  }
  if (g.scatterBound > 0.0) {
    num(cp, "Blocks_off_the_surface", g.outliers);
    dbl(cp, "Block_scatter", g.scatter);
    dbl(cp, "Block_scatter_bound", g.scatterBound);
  }
  if (g.source != CentroidSource::Fit) {
    dbl(cp, "Constant_centroid_cycles", g.constantCycles);
    dbl(cp, "Constant_centroid_coherence", g.constantCoherence);
  }
  const int st = base::SyncProfile(path);
  base::FreeProfile(path);
  if (st != 0) {
    base::report(base::kReportError, "Cannot write " + path);
    return 2;
  }
  return 0;
}

}  // namespace sar::doppler

#pragma once
// Output of the analyser: the printed table, the JSON file and the gnuplot figures.
#include <optional>
#include <ostream>
#include <string>
#include <string_view>
#include <vector>

#include "analyser/image.hpp"
#include "analyser/irf.hpp"
#include "analyser/targets.hpp"

namespace sar::analyser {

/// Pixel spacings in metres; NaN when unknown (then no widths in metres are given).
struct PixelSpacing {
  double azimuth_m = kNaN;
  double range_m = kNaN;
};

struct TargetResult {
  ExpectedTarget target;  ///< in image coordinates
  IrfMeasure measure;
};

/// Level of a profile: mean over the profile, extremes relative to it.
struct ProfileSummary {
  double mean_power = kNaN;
  double min_db = kNaN;     ///< lowest value relative to the mean, dB
  double max_db = kNaN;     ///< highest value relative to the mean, dB
  double ripple_db = kNaN;  ///< max_db - min_db
};
ProfileSummary summarize_profile(const std::vector<double>& profile);

struct AnalysisReport {
  std::string raster;
  RasterLayout layout;
  AnalyserOptions options;
  PixelSpacing spacing;
  std::vector<TargetResult> targets;
  std::optional<PowerProfiles> profiles;
};

void print_table(const AnalysisReport& report, std::ostream& out);
std::string to_json(const AnalysisReport& report);
/// Throws std::runtime_error when the file cannot be written.
void write_json(const AnalysisReport& report, const std::string& path);

struct PlotOutcome {
  std::string script;               ///< gnuplot script written
  std::vector<std::string> images;  ///< PNGs the script makes
  bool gnuplot_found = false;
  bool gnuplot_ok = false;          ///< gnuplot ran and ended with status 0
};

/// Writes the cut data (dB against position from the peak), the neighbourhood patches and the
/// profiles as PREFIX_*.dat, a script PREFIX.gp that turns them into PREFIX_*.png, and runs it
/// when gnuplot is on PATH. Needs measures taken with keep_curves. Throws std::runtime_error
/// when a file cannot be written; a missing gnuplot is no error.
PlotOutcome write_plots(const AnalysisReport& report, const std::string& prefix);

/// Full path of an executable found on PATH, or empty.
std::string find_on_path(std::string_view program);

}  // namespace sar::analyser

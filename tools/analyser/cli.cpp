#include "analyser/cli.hpp"

#include <algorithm>
#include <cmath>
#include <limits>
#include <optional>
#include <stdexcept>
#include <vector>

#include "analyser/image.hpp"
#include "analyser/irf.hpp"
#include "analyser/report.hpp"
#include "analyser/targets.hpp"
#include "io/cell_types.hpp"

namespace sar::analyser {

namespace {

constexpr const char* kUsage =
    "usage: sarirf RASTER [--target LINE,SAMPLE]... [--targets FILE] [--truth FILE]\n"
    "              [--first-line L] [--first-sample S] [--offset DLINE,DSAMPLE]\n"
    "              [--lines N] [--samples M] [--byte-order LSBFirst|MSBFirst] [--cell-type NAME]\n"
    "              [--header-offset BYTES] [--row-prefix BYTES]\n"
    "              [--azimuth-spacing M] [--range-spacing M]\n"
    "              [--oversample N] [--search N] [--neighbourhood N] [--cut N] [--max-cut N]\n"
    "              [--islr-span R] [--profiles] [--json FILE] [--plot PREFIX]\n"
    "Measures point targets (peak, -3 dB resolution, PSLR, ISLR, phase) of a complex raster and\n"
    "its mean power profiles. The raster's layout comes from RASTER.hdr unless --lines or\n"
    "--samples is given. Expected positions are mapped to the image by\n"
    "image = given - first + offset.\n";

struct UsageError : std::runtime_error {
  using std::runtime_error::runtime_error;
};

struct Command {
  std::string raster;
  std::vector<ExpectedTarget> targets;
  std::vector<std::string> target_lists;
  std::optional<std::string> truth;
  TargetMapping mapping;
  LayoutOverrides layout;
  PixelSpacing spacing;
  AnalyserOptions options;
  bool profiles = false;
  std::optional<std::string> json;
  std::optional<std::string> plot;
  bool help = false;
};

double number_of(const std::string& option, const std::string& text) {
  double v = 0.0;
  if (!parse_number(text, v)) throw UsageError(option + " needs a number, not \"" + text + "\"");
  return v;
}

long long integer_of(const std::string& option, const std::string& text, long long lo, long long hi) {
  const double v = number_of(option, text);
  if (v != std::floor(v) || v < static_cast<double>(lo) || v > static_cast<double>(hi)) {
    throw UsageError(option + " needs a whole number from " + std::to_string(lo) + " to " + std::to_string(hi));
  }
  return static_cast<long long>(v);
}

Command parse(std::span<const std::string> args) {
  Command c;
  for (std::size_t i = 0; i < args.size(); ++i) {
    const std::string& a = args[i];
    const auto next = [&]() -> const std::string& {
      if (i + 1 >= args.size()) throw UsageError(a + " needs a value");
      return args[++i];
    };
    constexpr long long kIntMax = std::numeric_limits<std::int32_t>::max();
    if (a == "--help" || a == "-h") {
      c.help = true;
    } else if (a == "--target") {
      ExpectedTarget t;
      if (!parse_position(next(), t.line, t.sample)) throw UsageError("--target needs LINE,SAMPLE");
      t.name = "target_" + std::to_string(c.targets.size() + 1);
      c.targets.push_back(t);
    } else if (a == "--targets") {
      c.target_lists.push_back(next());
    } else if (a == "--truth") {
      c.truth = next();
    } else if (a == "--first-line") {
      c.mapping.line_offset -= number_of(a, next());
    } else if (a == "--first-sample") {
      c.mapping.sample_offset -= number_of(a, next());
    } else if (a == "--offset") {
      double dl = 0.0;
      double ds = 0.0;
      if (!parse_position(next(), dl, ds)) throw UsageError("--offset needs DLINE,DSAMPLE");
      c.mapping.line_offset += dl;
      c.mapping.sample_offset += ds;
    } else if (a == "--lines") {
      c.layout.lines = static_cast<std::int32_t>(integer_of(a, next(), 1, kIntMax));
    } else if (a == "--samples") {
      c.layout.samples = static_cast<std::int32_t>(integer_of(a, next(), 1, kIntMax));
    } else if (a == "--byte-order") {
      const std::string& v = next();
      if (v != "LSBFirst" && v != "MSBFirst") throw UsageError("--byte-order is LSBFirst or MSBFirst");
      c.layout.byte_order = io::byte_order_from_name(v);
    } else if (a == "--cell-type") {
      const std::string& v = next();
      const std::int32_t type = io::cell_type_from_name(v);
      if (type < 0) throw UsageError("unknown cell type \"" + v + "\"");
      c.layout.cell_type = type;
    } else if (a == "--header-offset") {
      c.layout.header_offset = integer_of(a, next(), 0, std::numeric_limits<std::int64_t>::max() / 2);
    } else if (a == "--row-prefix") {
      c.layout.row_prefix = static_cast<std::int32_t>(integer_of(a, next(), 0, kIntMax));
    } else if (a == "--azimuth-spacing") {
      c.spacing.azimuth_m = number_of(a, next());
    } else if (a == "--range-spacing") {
      c.spacing.range_m = number_of(a, next());
    } else if (a == "--oversample") {
      c.options.oversample = static_cast<int>(integer_of(a, next(), 16, 256));
    } else if (a == "--search") {
      c.options.search_radius = static_cast<int>(integer_of(a, next(), 0, 4096));
    } else if (a == "--neighbourhood") {
      c.options.neighbourhood = static_cast<int>(integer_of(a, next(), 8, 256));
    } else if (a == "--cut") {
      c.options.cut_length = static_cast<int>(integer_of(a, next(), 8, 65536));
    } else if (a == "--max-cut") {
      c.options.max_cut_length = static_cast<int>(integer_of(a, next(), 8, 65536));
    } else if (a == "--islr-span") {
      c.options.islr_span = number_of(a, next());
      if (!(c.options.islr_span > 1.0 && c.options.islr_span <= 1000.0)) {
        throw UsageError("--islr-span needs a number of resolutions above 1");
      }
    } else if (a == "--profiles") {
      c.profiles = true;
    } else if (a == "--json") {
      c.json = next();
    } else if (a == "--plot") {
      c.plot = next();
    } else if (!a.empty() && a[0] == '-') {
      throw UsageError("unknown option " + a);
    } else if (c.raster.empty()) {
      c.raster = a;
    } else {
      throw UsageError("more than one raster: " + c.raster + ", " + a);
    }
  }
  if (c.help) return c;
  if (c.raster.empty()) throw UsageError("no raster given");
  if (c.targets.empty() && c.target_lists.empty() && !c.truth && !c.profiles) {
    throw UsageError("nothing to measure: give targets (--target, --targets, --truth) or --profiles");
  }
  if (static_cast<long long>(c.options.neighbourhood) * c.options.oversample > 4096) {
    throw UsageError("--neighbourhood times --oversample is limited to 4096");
  }
  return c;
}

// Measures one target on a window of the raster read around it.
IrfMeasure measure_in_raster(RasterReader& reader, const ExpectedTarget& t, const AnalyserOptions& o) {
  const RasterLayout& layout = reader.layout();
  if (!(t.line >= -0.5 && t.line <= layout.lines - 0.5 && t.sample >= -0.5 && t.sample <= layout.samples - 0.5)) {
    IrfMeasure m;
    m.expected_line = t.line;
    m.expected_sample = t.sample;
    m.problem = "expected position outside the image";
    return m;
  }
  const int half = o.search_radius + std::max(o.cut_length, o.max_cut_length) / 2 +
                   std::max(o.neighbourhood, o.interp_window) / 2 + 4;
  const int line = static_cast<int>(std::lround(t.line));
  const int sample = static_cast<int>(std::lround(t.sample));
  const ComplexImage window = reader.read(line - half, 2 * half + 1, sample - half, 2 * half + 1);
  return measure_point(window.view(), t.line, t.sample, o);
}

}  // namespace

int run_sarirf(std::span<const std::string> args, std::ostream& out, std::ostream& err) {
  Command c;
  try {
    c = parse(args);
  } catch (const UsageError& e) {
    err << "sarirf: " << e.what() << '\n' << kUsage;
    return 2;
  }
  if (c.help) {
    out << kUsage;
    return 0;
  }
  try {
    AnalysisReport report;
    report.raster = c.raster;
    report.layout = resolve_layout(c.raster, c.layout);
    report.options = c.options;
    report.options.keep_curves = c.plot.has_value();
    report.spacing = c.spacing;

    std::vector<ExpectedTarget> targets = c.targets;
    for (const std::string& list : c.target_lists) {
      std::vector<ExpectedTarget> more = read_target_list(list);
      targets.insert(targets.end(), more.begin(), more.end());
    }
    if (c.truth) {
      TruthTargets truth = read_truth_targets(*c.truth);
      targets.insert(targets.end(), truth.targets.begin(), truth.targets.end());
      if (!std::isfinite(report.spacing.range_m)) report.spacing.range_m = truth.range_spacing_m;
    }
    apply_mapping(targets, c.mapping);

    RasterReader reader(c.raster, report.layout);
    for (const ExpectedTarget& t : targets) {
      report.targets.push_back({t, measure_in_raster(reader, t, report.options)});
    }
    if (c.profiles) report.profiles = reader.power_profiles();

    print_table(report, out);
    if (c.json) {
      write_json(report, *c.json);
      out << "JSON written to " << *c.json << '\n';
    }
    if (c.plot) {
      const PlotOutcome plots = write_plots(report, *c.plot);
      if (!plots.gnuplot_found) {
        out << "gnuplot is not on PATH: no PNG made; data and script written (run: gnuplot " << plots.script << ")\n";
      } else if (!plots.gnuplot_ok) {
        out << "gnuplot failed on " << plots.script << ": the PNGs may be missing\n";
      } else {
        for (const std::string& png : plots.images) out << "Figure " << png << '\n';
      }
    }
  } catch (const std::exception& e) {
    err << "sarirf: " << e.what() << '\n';
    return 1;
  }
  return 0;
}

}  // namespace sar::analyser

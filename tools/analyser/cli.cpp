#include "analyser/cli.hpp"

#include <algorithm>
#include <cmath>
#include <limits>
#include <memory>
#include <optional>
#include <stdexcept>
#include <vector>

#include "analyser/image.hpp"
#include "analyser/irf.hpp"
#include "analyser/report.hpp"
#include "analyser/targets.hpp"
#include "base/command_line.hpp"
#include "io/cell_types.hpp"

namespace sar::analyser {

namespace {

constexpr const char* kUsage = "sarirf RASTER [--target LINE,SAMPLE]... [--targets FILE] [--truth FILE] [options]";

constexpr const char* kAbout =
    "Measures point targets (peak, -3 dB resolution, PSLR, ISLR, phase) of a complex raster and\n"
    "its mean power profiles. The raster's layout comes from RASTER.hdr unless --lines or\n"
    "--samples is given. Expected positions are mapped to the image by\n"
    "image = given - first + offset.";

constexpr const char* kExit =
    "Exit status: 0 when the analysis ran (targets that could not be measured are listed as\n"
    "such), 1 when an input cannot be read or an output cannot be written, 2 for a bad command.\n";

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

// "LINE,SAMPLE" as parse_position reads it.
CLI::Validator position(const std::string& form) {
  return CLI::Validator(
      [form](std::string& text) -> std::string {
        double a = 0.0, b = 0.0;
        return parse_position(text, a, b) ? std::string() : "takes " + form + ", not '" + text + "'";
      },
      form);
}

// The command line; `c` receives what it parses.
std::unique_ptr<CLI::App> command_line(Command& c, std::vector<std::string>& positions,
                                       std::vector<std::string>& offsets) {
  namespace cli = base::cli;
  using cli::shown_as;
  constexpr long long kIntMax = std::numeric_limits<std::int32_t>::max();
  auto app = cli::make_app("sarirf", kUsage, kAbout);
  app->add_option("RASTER", c.raster, "complex raster to analyse");
  shown_as(app->add_option("--target", positions, "expected position of a target, repeatable")
               ->check(position("LINE,SAMPLE"))
               ->allow_extra_args(false),
           "LINE,SAMPLE");
  shown_as(app->add_option("--targets", c.target_lists, "a file of targets, LINE SAMPLE [NAME] a line; repeatable")
               ->allow_extra_args(false),
           "FILE");
  shown_as(app->add_option_function<std::string>("--truth", [&c](const std::string& v) { c.truth = v; },
                                                 "the simulator's truth file: its targets and range spacing"),
           "FILE");
  shown_as(app->add_option_function<double>("--first-line", [&c](double v) { c.mapping.line_offset -= v; },
                                            "where the image starts in the given lines (image = given - L + offset)")
               ->check(cli::real_number()),
           "L");
  shown_as(app->add_option_function<double>("--first-sample", [&c](double v) { c.mapping.sample_offset -= v; },
                                            "where the image starts in the given samples")
               ->check(cli::real_number()),
           "S");
  shown_as(app->add_option("--offset", offsets, "added to every expected position")
               ->check(position("DLINE,DSAMPLE"))
               ->allow_extra_args(false),
           "DLINE,DSAMPLE");
  shown_as(app->add_option_function<std::int32_t>("--lines", [&c](std::int32_t v) { c.layout.lines = v; },
                                                  "lines of the raster (instead of its header)")
               ->check(cli::whole_number(1, kIntMax)),
           "N");
  shown_as(app->add_option_function<std::int32_t>("--samples", [&c](std::int32_t v) { c.layout.samples = v; },
                                                  "samples of a line (instead of its header)")
               ->check(cli::whole_number(1, kIntMax)),
           "M");
  shown_as(app->add_option_function<std::string>(
                   "--byte-order", [&c](const std::string& v) { c.layout.byte_order = io::byte_order_from_name(v); },
                   "byte order of the cells")
               ->check(cli::one_of({"LSBFirst", "MSBFirst"})),
           "LSBFirst|MSBFirst");
  shown_as(app->add_option_function<std::string>(
                   "--cell-type",
                   [&c](const std::string& v) { c.layout.cell_type = io::cell_type_from_name(v); },
                   "cell type name of the raster header")
               ->check(CLI::Validator(
                   [](std::string& v) -> std::string {
                     return io::cell_type_from_name(v) < 0 ? "takes a cell type name, not '" + v + "'" : std::string();
                   },
                   "NAME")),
           "NAME");
  shown_as(app->add_option_function<std::int64_t>(
                   "--header-offset", [&c](std::int64_t v) { c.layout.header_offset = v; },
                   "bytes before the first line")
               ->check(cli::whole_number(0, std::numeric_limits<std::int64_t>::max() / 2)),
           "BYTES");
  shown_as(app->add_option_function<std::int32_t>("--row-prefix", [&c](std::int32_t v) { c.layout.row_prefix = v; },
                                                  "bytes before each line")
               ->check(cli::whole_number(0, kIntMax)),
           "BYTES");
  shown_as(app->add_option("--azimuth-spacing", c.spacing.azimuth_m, "metres between lines")->check(cli::real_number()),
           "M");
  shown_as(app->add_option("--range-spacing", c.spacing.range_m, "metres between samples")->check(cli::real_number()),
           "M");
  shown_as(app->add_option("--oversample", c.options.oversample, "oversampling factor of the cuts (default 16)")
               ->check(cli::whole_number(16, 256)),
           "N");
  shown_as(app->add_option("--search", c.options.search_radius,
                           "the peak is sought within N samples of the expected position (default 8)")
               ->check(cli::whole_number(0, 4096)),
           "N");
  shown_as(app->add_option("--neighbourhood", c.options.neighbourhood,
                           "side of the neighbourhood oversampled to find the peak (default 32)")
               ->check(cli::whole_number(8, 256)),
           "N");
  shown_as(app->add_option("--cut", c.options.cut_length, "first window of a cut (default 128)")
               ->check(cli::whole_number(8, 65536)),
           "N");
  shown_as(app->add_option("--max-cut", c.options.max_cut_length,
                           "a cut's window grows up to this for the sidelobes (default 1024)")
               ->check(cli::whole_number(8, 65536)),
           "N");
  shown_as(app->add_option("--islr-span", c.options.islr_span,
                           "half width of the ISLR's sidelobe region, in resolutions (above 1,\n"
                           "default 10)")
               ->check(CLI::Validator(
                   [](std::string& v) -> std::string {
                     double span = 0.0;
                     return parse_number(v, span) && span > 1.0 && span <= 1000.0
                                ? std::string()
                                : "takes a number of resolutions above 1, not '" + v + "'";
                   },
                   "R")),
           "R");
  app->add_flag("--profiles", c.profiles, "also the mean power profiles in azimuth and range");
  shown_as(app->add_option_function<std::string>("--json", [&c](const std::string& v) { c.json = v; },
                                                 "write the report as JSON"),
           "FILE");
  shown_as(app->add_option_function<std::string>("--plot", [&c](const std::string& v) { c.plot = v; },
                                                 "write the cuts and profiles as data, a gnuplot script and PNGs"),
           "PREFIX");
  app->footer(kExit);
  app->allow_extras();  // refused in parse(), in words that name the raster
  return app;
}

Command parse(std::span<const std::string> args, std::string* help) {
  Command c;
  std::vector<std::string> positions, offsets;
  const auto app = command_line(c, positions, offsets);
  const base::cli::Parsed parsed = base::cli::parse(*app, std::vector<std::string>(args.begin(), args.end()));
  if (parsed.help) {
    c.help = true;
    *help = app->help();
    return c;
  }
  if (!parsed.error.empty()) throw UsageError(parsed.error);
  for (const std::string& extra : parsed.extras) {
    if (!extra.empty() && extra[0] == '-') throw UsageError("unknown option " + extra);
    throw UsageError("more than one raster: " + c.raster + ", " + extra);
  }
  for (const std::string& p : positions) {
    ExpectedTarget t;
    parse_position(p, t.line, t.sample);
    t.name = "target_" + std::to_string(c.targets.size() + 1);
    c.targets.push_back(t);
  }
  for (const std::string& o : offsets) {
    double dl = 0.0, ds = 0.0;
    parse_position(o, dl, ds);
    c.mapping.line_offset += dl;
    c.mapping.sample_offset += ds;
  }
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
  std::string help;
  try {
    c = parse(args, &help);
  } catch (const UsageError& e) {
    err << "sarirf: " << e.what() << "; see sarirf --help\n";
    return 2;
  }
  if (c.help) {
    out << help;
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

#include "analyser/report.hpp"

#include <unistd.h>

#include <algorithm>
#include <cmath>
#include <cstdarg>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <numbers>
#include <stdexcept>

#include "io/cell_types.hpp"

namespace sar::analyser {

namespace {

std::string format(const char* fmt, ...) __attribute__((format(printf, 1, 2)));
std::string format(const char* fmt, ...) {
  va_list args;
  va_start(args, fmt);
  va_list again;
  va_copy(again, args);
  const int n = std::vsnprintf(nullptr, 0, fmt, args);
  va_end(args);
  std::string out;
  if (n > 0) {
    out.resize(static_cast<std::size_t>(n) + 1);
    std::vsnprintf(out.data(), out.size(), fmt, again);
    out.resize(static_cast<std::size_t>(n));
  }
  va_end(again);
  return out;
}

// A fixed-width number, or a dash for an unknown one.
std::string cell(double v, int width, int decimals) {
  if (!std::isfinite(v)) return format("%*s", width, "-");
  return format("%*.*f", width, decimals, v);
}

double metres(double px, double spacing) { return std::isfinite(spacing) ? px * spacing : kNaN; }

double db20(double amplitude) { return amplitude > 0.0 ? 20.0 * std::log10(amplitude) : kNaN; }

// ------------------------------------------------------------------------------------- JSON

class Json {
 public:
  void open(char bracket) {
    separate();
    text_ += bracket;
    ++depth_;
    first_ = true;
  }
  void close(char bracket) {
    --depth_;
    if (!first_) newline();
    text_ += bracket;
    first_ = false;
  }
  void key(std::string_view k) {
    separate();
    string(k);
    text_ += ": ";
    pending_key_ = true;
  }
  void value(double v) {
    separate();
    text_ += std::isfinite(v) ? format("%.10g", v) : "null";
  }
  void value(long long v) {
    separate();
    text_ += std::to_string(v);
  }
  void value(bool v) {
    separate();
    text_ += v ? "true" : "false";
  }
  void value(std::string_view s) {
    separate();
    string(s);
  }
  // A long array of numbers on one line.
  void numbers(const std::vector<double>& values) {
    separate();
    text_ += '[';
    for (std::size_t i = 0; i < values.size(); ++i) {
      if (i > 0) text_ += ", ";
      text_ += std::isfinite(values[i]) ? format("%.8g", values[i]) : "null";
    }
    text_ += ']';
  }
  template <class T>
  void field(std::string_view k, T v) {
    key(k);
    value(v);
  }
  std::string take() { return std::move(text_) + "\n"; }

 private:
  void newline() {
    text_ += '\n';
    text_.append(static_cast<std::size_t>(2 * depth_), ' ');
  }
  void separate() {
    if (pending_key_) {
      pending_key_ = false;
      return;
    }
    if (depth_ == 0) return;
    if (!first_) text_ += ',';
    newline();
    first_ = false;
  }
  void string(std::string_view s) {
    text_ += '"';
    for (const char ch : s) {
      const auto c = static_cast<unsigned char>(ch);
      if (c == '"' || c == '\\') {
        text_ += '\\';
        text_ += ch;
      } else if (c < 0x20) {
        text_ += format("\\u%04x", c);
      } else {
        text_ += ch;
      }
    }
    text_ += '"';
  }

  std::string text_;
  int depth_ = 0;
  bool first_ = true;
  bool pending_key_ = false;
};

void json_pair(Json& j, std::string_view key, double a, double b) {
  j.key(key);
  j.numbers({a, b});
}

void json_cut(Json& j, const Irf1D& c, double spacing) {
  j.open('{');
  j.field("resolution_px", c.resolution);
  j.field("resolution_m", metres(c.resolution, spacing));
  j.field("pslr_db", c.pslr_db);
  j.field("islr_db", c.islr_db);
  j.field("peak", c.peak);
  json_pair(j, "half_power_points", c.half_power_before, c.half_power_after);
  json_pair(j, "nulls", c.null_before, c.null_after);
  j.field("sidelobe_at", c.sidelobe_at);
  json_pair(j, "sidelobe_region", c.region_first, c.region_last);
  j.field("span_truncated", c.span_truncated);
  j.field("centroid_cycles_per_sample", c.centroid);
  j.field("window_first", static_cast<long long>(c.window_first));
  j.field("window_length", static_cast<long long>(c.window_length));
  j.field("amplitude", c.amplitude);
  j.field("phase_rad", c.phase_rad);
  j.close('}');
}

void json_profile(Json& j, const std::vector<double>& values) {
  const ProfileSummary s = summarize_profile(values);
  j.open('{');
  j.field("count", static_cast<long long>(values.size()));
  j.field("mean_power", s.mean_power);
  j.field("min_db", s.min_db);
  j.field("max_db", s.max_db);
  j.field("ripple_db", s.ripple_db);
  j.key("mean_power_per_index");
  j.numbers(values);
  j.close('}');
}

// ------------------------------------------------------------------------------------ plots

std::string safe_name(const std::string& name) {
  std::string out;
  for (const char c : name) out += (std::isalnum(static_cast<unsigned char>(c)) || c == '-' || c == '_' || c == '.') ? c : '_';
  return out.empty() ? "target" : out;
}

// A gnuplot single-quoted string.
std::string gp_quote(const std::string& s) {
  std::string out = "'";
  for (const char c : s) {
    out += c;
    if (c == '\'') out += '\'';
  }
  return out + "'";
}

// A shell single-quoted word.
std::string sh_quote(const std::string& s) {
  std::string out = "'";
  for (const char c : s) {
    if (c == '\'') {
      out += "'\\''";
    } else {
      out += c;
    }
  }
  return out + "'";
}

std::ofstream open_output(const std::string& path) {
  std::ofstream out(path, std::ios::trunc);
  if (!out) throw std::runtime_error("cannot write " + path);
  return out;
}

void finish(std::ofstream& out, const std::string& path) {
  out.close();
  if (!out) throw std::runtime_error("cannot write " + path);
}

void write_cut_data(const Irf1D& c, const std::string& path) {
  std::ofstream out = open_output(path);
  out << "# position from the peak (samples), power relative to the peak (dB)\n";
  const double step = 1.0 / std::max(1, c.oversample);
  for (std::size_t i = 0; i < c.curve_db.size(); ++i) {
    out << format("%.5f %.4f\n", c.curve_first + static_cast<double>(i) * step - c.peak, c.curve_db[i]);
  }
  finish(out, path);
}

void write_patch_data(const IrfMeasure& m, int oversample, const std::string& path) {
  std::ofstream out = open_output(path);
  out << "# sample from the peak, line from the peak, power relative to the peak (dB)\n";
  const double step = 1.0 / std::max(1, oversample);
  for (int a = 0; a < m.patch_lines; ++a) {
    for (int r = 0; r < m.patch_samples; ++r) {
      out << format("%.4f %.4f %.3f\n", m.patch_first_sample + r * step - m.peak_sample,
                    m.patch_first_line + a * step - m.peak_line,
                    m.patch_db[static_cast<std::size_t>(a) * static_cast<std::size_t>(m.patch_samples) +
                               static_cast<std::size_t>(r)]);
    }
    out << '\n';
  }
  finish(out, path);
}

void write_profile_data(const std::vector<double>& values, const std::string& path) {
  const ProfileSummary s = summarize_profile(values);
  std::ofstream out = open_output(path);
  out << "# index, mean power relative to the profile's mean (dB)\n";
  for (std::size_t i = 0; i < values.size(); ++i) {
    const double db = values[i] > 0.0 && s.mean_power > 0.0 ? 10.0 * std::log10(values[i] / s.mean_power) : -300.0;
    out << format("%zu %.4f\n", i, db);
  }
  finish(out, path);
}

}  // namespace

ProfileSummary summarize_profile(const std::vector<double>& profile) {
  ProfileSummary s;
  if (profile.empty()) return s;
  double sum = 0.0;
  double lo = profile.front();
  double hi = profile.front();
  for (const double v : profile) {
    sum += v;
    lo = std::min(lo, v);
    hi = std::max(hi, v);
  }
  s.mean_power = sum / static_cast<double>(profile.size());
  if (s.mean_power > 0.0) {
    s.max_db = 10.0 * std::log10(hi / s.mean_power);
    if (lo > 0.0) {
      s.min_db = 10.0 * std::log10(lo / s.mean_power);
      s.ripple_db = s.max_db - s.min_db;
    }
  }
  return s;
}

void print_table(const AnalysisReport& r, std::ostream& out) {
  out << format("Raster %s: %d lines x %d samples, %s\n", r.raster.c_str(), r.layout.lines, r.layout.samples,
                std::string(io::cell_type_name(r.layout.cell_type)).c_str());
  out << format("Oversampling %dx, ISLR over +-%g resolutions, spacing azimuth %s m, range %s m\n",
                r.options.oversample, r.options.islr_span,
                std::isfinite(r.spacing.azimuth_m) ? format("%g", r.spacing.azimuth_m).c_str() : "?",
                std::isfinite(r.spacing.range_m) ? format("%g", r.spacing.range_m).c_str() : "?");
  if (!r.targets.empty()) {
    out << format("%-12s %10s %10s %11s %11s %8s %8s %8s %8s %8s %8s %8s %8s %8s %8s %8s %8s\n", "target", "exp line",
                  "exp samp", "peak line", "peak samp", "d line", "d samp", "az px", "az m", "rg px", "rg m",
                  "PSLR az", "PSLR rg", "ISLR az", "ISLR rg", "amp dB", "phase");
    bool truncated = false;
    for (const TargetResult& t : r.targets) {
      const IrfMeasure& m = t.measure;
      std::string row = format("%-12s %10.3f %10.3f", t.target.name.c_str(), t.target.line, t.target.sample);
      if (!m.valid) {
        out << row << "  not measured: " << m.problem << '\n';
        continue;
      }
      const bool az_short = m.azimuth.span_truncated;
      const bool rg_short = m.range.span_truncated;
      truncated = truncated || az_short || rg_short;
      row += ' ' + cell(m.peak_line, 11, 3) + ' ' + cell(m.peak_sample, 11, 3);
      row += ' ' + cell(m.peak_line - t.target.line, 8, 3) + ' ' + cell(m.peak_sample - t.target.sample, 8, 3);
      row += ' ' + cell(m.res_az_px, 8, 4) + ' ' + cell(metres(m.res_az_px, r.spacing.azimuth_m), 8, 3);
      row += ' ' + cell(m.res_rg_px, 8, 4) + ' ' + cell(metres(m.res_rg_px, r.spacing.range_m), 8, 3);
      row += ' ' + cell(m.pslr_az_db, 8, 2) + ' ' + cell(m.pslr_rg_db, 8, 2);
      row += ' ' + cell(m.islr_az_db, az_short ? 7 : 8, 2) + (az_short ? "*" : "");
      row += ' ' + cell(m.islr_rg_db, rg_short ? 7 : 8, 2) + (rg_short ? "*" : "");
      row += ' ' + cell(db20(m.amplitude), 8, 2) + ' ' + cell(m.phase_rad * 180.0 / std::numbers::pi, 8, 2);
      out << row << '\n';
    }
    out << "Resolutions at -3 dB; PSLR and ISLR in dB; phase in degrees; d = peak - expected.\n";
    if (truncated) out << "* ISLR over a shorter span: the data end before the full span.\n";
  }
  if (r.profiles) {
    const auto line = [&](const char* what, const char* unit, const std::vector<double>& v) {
      const ProfileSummary s = summarize_profile(v);
      out << format("%s profile: %zu %s, mean power %.6g, min %s dB, max %s dB, ripple %s dB (relative to the mean)\n",
                    what, v.size(), unit, s.mean_power, cell(s.min_db, 0, 3).c_str(), cell(s.max_db, 0, 3).c_str(),
                    cell(s.ripple_db, 0, 3).c_str());
    };
    line("Range", "samples", r.profiles->range);
    line("Azimuth", "lines", r.profiles->azimuth);
  }
}

std::string to_json(const AnalysisReport& r) {
  Json j;
  j.open('{');
  j.field("raster", std::string_view(r.raster));
  j.field("lines", static_cast<long long>(r.layout.lines));
  j.field("samples", static_cast<long long>(r.layout.samples));
  j.field("cell_type", io::cell_type_name(r.layout.cell_type));
  j.key("options");
  j.open('{');
  j.field("oversample", static_cast<long long>(r.options.oversample));
  j.field("search_radius", static_cast<long long>(r.options.search_radius));
  j.field("neighbourhood", static_cast<long long>(r.options.neighbourhood));
  j.field("cut_length", static_cast<long long>(r.options.cut_length));
  j.field("max_cut_length", static_cast<long long>(r.options.max_cut_length));
  j.field("islr_span_resolutions", r.options.islr_span);
  j.close('}');
  j.key("spacing_m");
  j.open('{');
  j.field("azimuth", r.spacing.azimuth_m);
  j.field("range", r.spacing.range_m);
  j.close('}');
  j.key("targets");
  j.open('[');
  for (const TargetResult& t : r.targets) {
    const IrfMeasure& m = t.measure;
    j.open('{');
    j.field("name", std::string_view(t.target.name));
    j.field("valid", m.valid);
    if (!m.valid) j.field("problem", std::string_view(m.problem));
    j.field("expected_line", t.target.line);
    j.field("expected_sample", t.target.sample);
    if (m.valid) {
      j.field("peak_line", m.peak_line);
      j.field("peak_sample", m.peak_sample);
      j.field("offset_line", m.peak_line - t.target.line);
      j.field("offset_sample", m.peak_sample - t.target.sample);
      j.field("amplitude", m.amplitude);
      j.field("amplitude_db", db20(m.amplitude));
      j.field("phase_rad", m.phase_rad);
      j.field("phase_deg", m.phase_rad * 180.0 / std::numbers::pi);
      j.key("azimuth");
      json_cut(j, m.azimuth, r.spacing.azimuth_m);
      j.key("range");
      json_cut(j, m.range, r.spacing.range_m);
    }
    j.close('}');
  }
  j.close(']');
  if (r.profiles) {
    j.key("profiles");
    j.open('{');
    j.key("range");
    json_profile(j, r.profiles->range);
    j.key("azimuth");
    json_profile(j, r.profiles->azimuth);
    j.close('}');
  }
  j.close('}');
  return j.take();
}

void write_json(const AnalysisReport& report, const std::string& path) {
  std::ofstream out = open_output(path);
  out << to_json(report);
  finish(out, path);
}

std::string find_on_path(std::string_view program) {
  const char* path = std::getenv("PATH");
  if (path == nullptr || program.empty()) return {};
  std::string_view rest(path);
  while (true) {
    const std::size_t colon = rest.find(':');
    const std::string dir(rest.substr(0, colon));
    if (!dir.empty()) {
      const std::string candidate = dir + "/" + std::string(program);
      std::error_code ec;
      if (std::filesystem::is_regular_file(candidate, ec) && ::access(candidate.c_str(), X_OK) == 0) return candidate;
    }
    if (colon == std::string_view::npos) break;
    rest.remove_prefix(colon + 1);
  }
  return {};
}

PlotOutcome write_plots(const AnalysisReport& r, const std::string& prefix) {
  PlotOutcome outcome;
  outcome.script = prefix + ".gp";
  std::ofstream gp = open_output(outcome.script);
  gp << "# Figures of the image quality analysis; run with gnuplot.\n"
        "set terminal png size 900,600 noenhanced\n"
        "set grid\n";
  const auto figure = [&](const std::string& png, const std::string& title, const std::string& xlabel,
                          const std::string& ylabel, const std::string& plot) {
    gp << "set output " << gp_quote(png) << "\nset title " << gp_quote(title) << "\nset xlabel " << gp_quote(xlabel)
       << "\nset ylabel " << gp_quote(ylabel) << '\n'
       << plot << '\n';
    outcome.images.push_back(png);
  };
  for (const TargetResult& t : r.targets) {
    const IrfMeasure& m = t.measure;
    if (!m.valid) continue;
    const std::string base = prefix + "_" + safe_name(t.target.name);
    const struct {
      const Irf1D* cut;
      const char* what;
      const char* unit;
    } cuts[] = {{&m.range, "range", "samples"}, {&m.azimuth, "azimuth", "lines"}};
    for (const auto& c : cuts) {
      if (c.cut->curve_db.empty()) continue;
      const std::string dat = base + "_" + c.what + ".dat";
      write_cut_data(*c.cut, dat);
      gp << "set yrange [-60:3]\nset xrange [*:*]\n";
      figure(base + "_" + c.what + ".png",
             t.target.name + ": " + c.what + format(" cut, resolution %.3f, PSLR %.2f dB, ISLR %.2f dB",
                                                      c.cut->resolution, c.cut->pslr_db, c.cut->islr_db),
             std::string(c.unit) + " from the peak", "power (dB)",
             "plot " + gp_quote(dat) + " using 1:2 with lines title '" + c.what + "', -3 with lines dt 2 title '-3 dB'");
    }
    if (!m.patch_db.empty()) {
      const std::string dat = base + "_patch.dat";
      write_patch_data(m, r.options.oversample, dat);
      gp << "set yrange [*:*]\nset xrange [*:*]\nset cbrange [-40:0]\n";
      figure(base + "_patch.png", t.target.name + ": oversampled neighbourhood (dB)", "samples from the peak",
             "lines from the peak", "plot " + gp_quote(dat) + " using 1:2:3 with image notitle");
    }
  }
  if (r.profiles) {
    gp << "set yrange [*:*]\nset xrange [*:*]\n";
    const std::pair<const std::vector<double>*, const char*> profiles[] = {{&r.profiles->range, "range"},
                                                                          {&r.profiles->azimuth, "azimuth"}};
    for (const auto& [values, what] : profiles) {
      const std::string dat = prefix + "_profile_" + what + ".dat";
      write_profile_data(*values, dat);
      figure(prefix + "_profile_" + what + ".png", std::string("mean power by ") + what, what == std::string("range") ? "sample" : "line",
             "power relative to the mean (dB)", "plot " + gp_quote(dat) + " using 1:2 with lines notitle");
    }
  }
  finish(gp, outcome.script);

  const std::string gnuplot = find_on_path("gnuplot");
  outcome.gnuplot_found = !gnuplot.empty();
  if (outcome.gnuplot_found && !outcome.images.empty()) {
    const std::string command = sh_quote(gnuplot) + " " + sh_quote(outcome.script);
    outcome.gnuplot_ok = std::system(command.c_str()) == 0;
  }
  return outcome;
}

}  // namespace sar::analyser

// Image quality analyser: impulse responses of weighted spectra measured against references
// computed from the continuous functions, 2-D targets with a Doppler centroid, power profiles,
// and the sarirf command on rasters written here.
#include <gtest/gtest.h>

#include <cmath>
#include <complex>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <functional>
#include <map>
#include <numbers>
#include <sstream>
#include <stdexcept>
#include <string>
#include <vector>

#include "analyser/cli.hpp"
#include "analyser/image.hpp"
#include "analyser/irf.hpp"
#include "analyser/report.hpp"
#include "analyser/targets.hpp"
#include "dsp/fft.hpp"
#include "io/data_file.hpp"

namespace an = sar::analyser;
using fcomplex = std::complex<float>;

namespace {

constexpr double kPi = std::numbers::pi;

double sinc(double x) { return std::abs(x) < 1e-12 ? 1.0 : std::sin(kPi * x) / (kPi * x); }

// Response of a band of width B (cycles a sample) weighted by sum_k c_k cos(2 pi k f / B):
// h(t) = B [c_0 sinc(Bt) + sum_k c_k (sinc(Bt - k) + sinc(Bt + k)) / 2].
struct Response {
  std::string name;
  std::vector<double> c;
  double band;
  double operator()(double t) const {
    double h = c[0] * sinc(band * t);
    for (std::size_t k = 1; k < c.size(); ++k) {
      h += 0.5 * c[k] * (sinc(band * t - static_cast<double>(k)) + sinc(band * t + static_cast<double>(k)));
    }
    return band * h;
  }
};

// Taylor weighting, nbar terms, peak sidelobe level sll (dB, negative): 1 + 2 sum F_m cos.
std::vector<double> taylor(int nbar, double sll) {
  const double a = std::acosh(std::pow(10.0, -sll / 20.0)) / kPi;
  const double sigma2 = nbar * nbar / (a * a + (nbar - 0.5) * (nbar - 0.5));
  std::vector<double> c{1.0};
  for (int m = 1; m < nbar; ++m) {
    double num = (m % 2 == 1) ? 1.0 : -1.0;
    double den = 2.0;
    for (int n = 1; n < nbar; ++n) {
      num *= 1.0 - m * m / (sigma2 * (a * a + (n - 0.5) * (n - 0.5)));
      if (n != m) den *= 1.0 - static_cast<double>(m * m) / (n * n);
    }
    c.push_back(2.0 * num / den);
  }
  return c;
}

const std::vector<double> kUniform{1.0};
const std::vector<double> kHamming{0.54, 0.46};

// Figures of the continuous response, by dense evaluation: it is real, even and crosses zero
// at its nulls.
struct Reference {
  double width, pslr_db, islr_db, peak;
};

Reference reference(const Response& h, double span) {
  Reference r{};
  r.peak = h(0.0);
  const double half = 0.5 * r.peak * r.peak;
  const auto bisect = [](const std::function<double(double)>& f, double a, double b) {
    for (int i = 0; i < 100; ++i) {
      const double c = 0.5 * (a + b);
      if ((f(a) > 0) == (f(c) > 0)) {
        a = c;
      } else {
        b = c;
      }
    }
    return 0.5 * (a + b);
  };
  const double t3 = bisect([&](double t) { return h(t) * h(t) - half; }, 0.0, 1.0 / h.band);
  r.width = 2.0 * t3;
  const double step = 1e-3 / h.band;
  double t = t3;
  while (h(t + step) > 0.0) t += step;
  const double null = bisect([&](double x) { return h(x); }, t, t + step);
  const double end = span * r.width;
  const auto simpson = [&](double a, double b) {
    const int n = 40000;
    const double dx = (b - a) / n;
    double s = h(a) * h(a) + h(b) * h(b);
    for (int i = 1; i < n; ++i) s += (i % 2 ? 4.0 : 2.0) * h(a + i * dx) * h(a + i * dx);
    return s * dx / 3.0;
  };
  double highest = 0.0;
  for (double x = null; x <= end; x += 1e-4 / h.band) highest = std::max(highest, h(x) * h(x));
  r.pslr_db = 10.0 * std::log10(highest / (r.peak * r.peak));
  r.islr_db = 10.0 * std::log10(simpson(null, end) / simpson(0.0, null));
  return r;
}

// Samples n = 0..count-1 of amplitude h(n - centre) exp(j (2 pi fd (n - centre) + phase)).
std::vector<fcomplex> sampled(const Response& h, int count, double centre, double fd, double phase) {
  std::vector<fcomplex> x(static_cast<std::size_t>(count));
  for (int n = 0; n < count; ++n) {
    const double t = n - centre;
    x[static_cast<std::size_t>(n)] = fcomplex(std::polar(h(t), 2.0 * kPi * fd * t + phase));
  }
  return x;
}

double wrap(double phase) { return std::remainder(phase, 2.0 * kPi); }

void expect_relative(double measured, double expected, double tolerance, const std::string& what) {
  EXPECT_NEAR(measured, expected, std::abs(expected) * tolerance) << what;
}

// Transforms of the analyser are planned at once, and the setting is put back after each test.
class Analyser : public ::testing::Test {
 protected:
  void SetUp() override {
    saved_ = sar::dsp::fft_planning();
    sar::dsp::set_fft_planning(sar::dsp::FftPlanning::Estimate);
  }
  void TearDown() override { sar::dsp::set_fft_planning(saved_); }

 private:
  sar::dsp::FftPlanning saved_ = sar::dsp::FftPlanning::Measure;
};

}  // namespace

TEST_F(Analyser, ReferencesMatchTheKnownFiguresOfTheirWeightings) {
  const Reference uniform = reference({"uniform", kUniform, 1.0}, 10.0);
  EXPECT_NEAR(uniform.width, 0.8859, 1e-3);
  EXPECT_NEAR(uniform.pslr_db, -13.26, 0.01);
  EXPECT_LT(uniform.islr_db, -9.6);
  EXPECT_GT(uniform.islr_db, -10.3);
  const Reference hamming = reference({"hamming", kHamming, 1.0}, 10.0);
  EXPECT_NEAR(hamming.width, 1.30, 0.01);
  EXPECT_NEAR(hamming.pslr_db, -42.7, 0.3);
  const Reference tay = reference({"taylor", taylor(4, -30.0), 1.0}, 10.0);
  EXPECT_NEAR(tay.pslr_db, -30.0, 0.5);
}

TEST_F(Analyser, CutsOfWeightedResponsesMatchTheContinuousReference) {
  struct Case {
    Response h;
    double fd, offset;
    int length;
  };
  const std::vector<Case> cases = {
      {{"uniform, critically sampled", kUniform, 1.0}, 0.0, 0.0, 256},
      {{"uniform, critically sampled", kUniform, 1.0}, 0.0, 0.5, 256},
      {{"uniform, critically sampled", kUniform, 1.0}, 0.0, 0.27, 256},
      {{"uniform", kUniform, 0.8}, 0.3, 0.37, 256},
      {{"uniform, wide", kUniform, 0.15}, 0.1, 0.61, 1024},
      {{"hamming", kHamming, 0.8}, -0.45, 0.13, 256},
      {{"hamming, critically sampled", kHamming, 1.0}, 0.0, 0.5, 256},
      {{"taylor", taylor(4, -30.0), 0.9}, 0.2, 0.71, 256},
      {{"taylor, across the folding frequency", taylor(4, -30.0), 0.6}, 0.48, 0.05, 300},
  };
  for (const Case& c : cases) {
    const Reference ref = reference(c.h, 10.0);
    const double centre = c.length / 2 + c.offset;
    const double phase = 0.7;
    const auto x = sampled(c.h, c.length, centre, c.fd, phase);
    const an::Irf1D m = an::measure_cut(x, centre + 3.0, 16);
    const std::string what = c.h.name + " B=" + std::to_string(c.h.band) + " offset " + std::to_string(c.offset);
    ASSERT_TRUE(m.valid) << what << ": " << m.problem;
    EXPECT_NEAR(m.peak, centre, 0.01) << what;
    expect_relative(m.resolution, ref.width, 0.01, what + " resolution");
    expect_relative(m.pslr_db, ref.pslr_db, 0.01, what + " PSLR");
    expect_relative(m.islr_db, ref.islr_db, 0.01, what + " ISLR");
    expect_relative(m.amplitude, ref.peak, 0.01, what + " amplitude");
    EXPECT_NEAR(wrap(m.phase_rad - phase), 0.0, 0.01) << what;
    EXPECT_FALSE(m.span_truncated) << what;
    EXPECT_LT(m.null_before, m.half_power_before) << what;
    EXPECT_GT(m.null_after, m.half_power_after) << what;
  }
}

TEST_F(Analyser, SubPixelPeaksAreFoundWithinAHundredthOfASample) {
  // A critically sampled band has no room for a centroid: only the weighted one is shifted.
  const std::pair<Response, double> responses[] = {{{"uniform", kUniform, 1.0}, 0.0}, {{"hamming", kHamming, 0.8}, 0.25}};
  for (const auto& [h, fd] : responses) {
    for (int k = 0; k < 10; ++k) {
      const double centre = 64.0 + 0.1 * k + 0.013;
      const auto x = sampled(h, 128, centre, fd, -2.0);
      for (const double guess : {-6.0, 0.0, 6.0}) {
        const an::Irf1D m = an::measure_cut(x, centre + guess, 16);
        ASSERT_TRUE(m.valid) << h.name << " " << centre << ": " << m.problem;
        EXPECT_NEAR(m.peak, centre, 0.01) << h.name << " guess " << guess;
      }
    }
  }
}

TEST_F(Analyser, CutsThatCannotBeMeasuredSaySo) {
  const Response h{"hamming", kHamming, 0.8};
  const auto x = sampled(h, 64, 32.3, 0.0, 0.0);
  EXPECT_FALSE(an::measure_cut(std::span<const fcomplex>(x).first(5), 2.0, 16).valid);
  EXPECT_FALSE(an::measure_cut(x, 80.0, 16).valid);
  EXPECT_FALSE(an::measure_cut(x, std::nan(""), 16).valid);
  EXPECT_FALSE(an::measure_cut(std::vector<fcomplex>(64), 32.0, 16).valid);
  EXPECT_FALSE(an::measure_cut(x, 32.0, 1).valid);
  // A brighter response beyond the search window is not taken for the one sought.
  an::AnalyserOptions narrow;
  narrow.search_radius = 3;
  EXPECT_EQ(an::measure_cut(x, 27.0, narrow).problem, "the response rises beyond the search window");
  EXPECT_TRUE(an::measure_cut(x, 29.0, narrow).valid);
  // Near the end of the data the sidelobe region is cut short and says so.
  const auto edge = sampled(h, 64, 4.2, 0.0, 0.0);
  const an::Irf1D m = an::measure_cut(edge, 4.0, 16);
  ASSERT_TRUE(m.valid) << m.problem;
  EXPECT_TRUE(m.span_truncated);
  EXPECT_NEAR(m.peak, 4.2, 0.01);
  EXPECT_DOUBLE_EQ(m.region_first, 0.0);
}

namespace {

// A separable target: azimuth and range responses, each with its own centroid.
struct Target2D {
  Response az, rg;
  double line, sample, fd_az, fd_rg, amplitude, phase;
};

void add_target(std::vector<fcomplex>& image, int lines, int samples, const Target2D& t) {
  const auto a = sampled(t.az, lines, t.line, t.fd_az, 0.0);
  const auto r = sampled(t.rg, samples, t.sample, t.fd_rg, t.phase);
  for (int l = 0; l < lines; ++l) {
    for (int s = 0; s < samples; ++s) {
      image[static_cast<std::size_t>(l * samples + s)] +=
          static_cast<float>(t.amplitude) * a[static_cast<std::size_t>(l)] * r[static_cast<std::size_t>(s)];
    }
  }
}

void expect_target(const an::IrfMeasure& m, const Target2D& t, const std::string& what) {
  ASSERT_TRUE(m.valid) << what << ": " << m.problem;
  const Reference ra = reference(t.az, 10.0);
  const Reference rr = reference(t.rg, 10.0);
  EXPECT_NEAR(m.peak_line, t.line, 0.01) << what;
  EXPECT_NEAR(m.peak_sample, t.sample, 0.01) << what;
  expect_relative(m.res_az_px, ra.width, 0.01, what + " azimuth resolution");
  expect_relative(m.res_rg_px, rr.width, 0.01, what + " range resolution");
  expect_relative(m.pslr_az_db, ra.pslr_db, 0.01, what + " azimuth PSLR");
  expect_relative(m.pslr_rg_db, rr.pslr_db, 0.01, what + " range PSLR");
  expect_relative(m.islr_az_db, ra.islr_db, 0.01, what + " azimuth ISLR");
  expect_relative(m.islr_rg_db, rr.islr_db, 0.01, what + " range ISLR");
  expect_relative(m.amplitude, t.amplitude * ra.peak * rr.peak, 0.01, what + " amplitude");
  EXPECT_NEAR(wrap(m.phase_rad - t.phase), 0.0, 0.01) << what;
}

}  // namespace

TEST_F(Analyser, PointTargetsWithADopplerCentroidAreMeasuredRight) {
  const int lines = 160;
  const int samples = 192;
  const std::vector<Target2D> cases = {
      // The azimuth band [0.05, 0.75] runs across the folding frequency.
      {{"hamming", kHamming, 0.7}, {"taylor", taylor(4, -30.0), 0.85}, 70.37, 101.62, 0.4, -0.1, 3.0, 1.0},
      {{"uniform", kUniform, 0.8}, {"hamming", kHamming, 0.9}, 88.91, 60.08, -0.35, 0.0, 0.5, -2.5},
  };
  for (const Target2D& t : cases) {
    std::vector<fcomplex> image(static_cast<std::size_t>(lines * samples));
    add_target(image, lines, samples, t);
    const an::ComplexImageView view{image, lines, samples, samples, 0, 0};
    const an::IrfMeasure m = an::measure_point(view, t.line + 3.4, t.sample - 2.8, an::AnalyserOptions{});
    expect_target(m, t, t.az.name + "/" + t.rg.name);
    EXPECT_NEAR(m.centroid_az, t.fd_az, 0.02);
    EXPECT_NEAR(m.centroid_rg, t.fd_rg, 0.02);
  }
}

TEST_F(Analyser, AViewIsMeasuredInWholeImageCoordinatesBesideABrighterTarget) {
  const int lines = 128;
  const int samples = 160;
  const Target2D weak{{"hamming", kHamming, 0.75}, {"hamming", kHamming, 0.8}, 60.25, 50.7, 0.3, 0.0, 1.0, 0.4};
  const Target2D strong{{"hamming", kHamming, 0.75}, {"hamming", kHamming, 0.8}, 64.5, 95.1, 0.3, 0.0, 20.0, 0.0};
  std::vector<fcomplex> image(static_cast<std::size_t>(lines * samples));
  add_target(image, lines, samples, weak);
  add_target(image, lines, samples, strong);
  // The window starts at line 1000, sample 2000 of a larger image.
  const an::ComplexImageView view{image, lines, samples, samples, 1000, 2000};
  an::AnalyserOptions o;
  o.keep_curves = true;
  const an::IrfMeasure m = an::measure_point(view, 1000 + weak.line + 2.0, 2000 + weak.sample + 1.0, o);
  ASSERT_TRUE(m.valid) << m.problem;
  EXPECT_NEAR(m.peak_line, 1000 + weak.line, 0.01);
  EXPECT_NEAR(m.peak_sample, 2000 + weak.sample, 0.01);
  expect_relative(m.res_rg_px, reference(weak.rg, 10.0).width, 0.01, "range resolution");
  expect_relative(m.res_az_px, reference(weak.az, 10.0).width, 0.01, "azimuth resolution");
  // Curves for the figures: 0 dB at the peak, positions in image coordinates.
  ASSERT_FALSE(m.range.curve_db.empty());
  const double at_peak = (m.peak_sample - m.range.curve_first) * m.range.oversample;
  EXPECT_NEAR(m.range.curve_db[static_cast<std::size_t>(std::lround(at_peak))], 0.0, 0.05);
  ASSERT_EQ(m.patch_db.size(), static_cast<std::size_t>(m.patch_lines) * static_cast<std::size_t>(m.patch_samples));
  EXPECT_GT(m.patch_first_line, 1000.0);
  an::AnalyserOptions narrow = o;
  narrow.search_radius = 4;
  EXPECT_EQ(an::measure_point(view, 1000 + strong.line, 2000 + strong.sample - 6.0, narrow).problem,
            "the response rises beyond the search window");
  // Outside the window, and in an image too small to hold a response.
  EXPECT_FALSE(an::measure_point(view, 10.0, 10.0, o).valid);
  const an::ComplexImageView tiny{std::span<const fcomplex>(image).first(20), 4, 5, 5, 0, 0};
  EXPECT_FALSE(an::measure_point(tiny, 2.0, 2.0, o).valid);
  const an::ComplexImageView lying{std::span<const fcomplex>(image).first(20), 40, 50, 50, 0, 0};
  EXPECT_FALSE(an::measure_point(lying, 2.0, 2.0, o).valid);
}

namespace {

std::string scratch(const std::string& name) {
  const std::filesystem::path dir = std::filesystem::path(SAR_BINARY_DIR) / "test_tools_analyser";
  std::filesystem::create_directories(dir);
  return (dir / name).string();
}

// Writes a raster with its profile text header (or none) in the given byte order.
void write_raster(const std::string& path, const std::vector<fcomplex>& image, int lines, int samples, int32_t order,
                  bool header) {
  sar::io::DataFile df(path);
  df.lines = lines;
  df.pixels = samples;
  df.cellType = sar::io::kFloatComplex;
  df.byteOrder = order;
  std::filesystem::remove(path + ".hdr");
  ASSERT_EQ(df.open(1), 0);
  sar::io::BufferIO w(&df, 0, samples, 0, lines, sar::io::kFloatComplex);
  ASSERT_EQ(w.writebuffer(image.data()), 0);
  ASSERT_EQ(df.close(), 0);
  if (header) {
    ASSERT_EQ(df.write_hdr_profile(), 0);
  }
}

int run(const std::vector<std::string>& args, std::string& out, std::string& err) {
  std::ostringstream o;
  std::ostringstream e;
  const int status = an::run_sarirf(args, o, e);
  out = o.str();
  err = e.str();
  return status;
}

// A small JSON reader: enough to prove the file well formed and to look values up.
struct Json {
  enum Kind { kNull, kBool, kNumber, kString, kArray, kObject } kind = kNull;
  double number = 0.0;
  bool boolean = false;
  std::string text;
  std::vector<Json> items;
  std::map<std::string, Json> fields;

  const Json& operator[](const std::string& key) const {
    const auto it = fields.find(key);
    if (kind != kObject || it == fields.end()) throw std::runtime_error("no key " + key);
    return it->second;
  }
  const Json& operator[](std::size_t i) const {
    if (kind != kArray || i >= items.size()) throw std::runtime_error("no item");
    return items[i];
  }
};

class JsonReader {
 public:
  explicit JsonReader(std::string text) : s_(std::move(text)) {}
  Json document() {
    Json v = value();
    blanks();
    if (i_ != s_.size()) fail();
    return v;
  }

 private:
  [[noreturn]] void fail() const { throw std::runtime_error("bad JSON at " + std::to_string(i_)); }
  void blanks() {
    while (i_ < s_.size() && std::isspace(static_cast<unsigned char>(s_[i_]))) ++i_;
  }
  bool take(char c) {
    blanks();
    if (i_ < s_.size() && s_[i_] == c) {
      ++i_;
      return true;
    }
    return false;
  }
  bool word(const char* w) {
    const std::string_view v(w);
    if (s_.compare(i_, v.size(), v) != 0) return false;
    i_ += v.size();
    return true;
  }
  std::string string() {
    if (!take('"')) fail();
    std::string out;
    while (i_ < s_.size() && s_[i_] != '"') {
      char c = s_[i_++];
      if (static_cast<unsigned char>(c) < 0x20) fail();
      if (c == '\\') {
        if (i_ >= s_.size()) fail();
        c = s_[i_++];
        if (c == 'u') {
          if (i_ + 4 > s_.size()) fail();
          c = static_cast<char>(std::stoi(s_.substr(i_, 4), nullptr, 16));
          i_ += 4;
        } else if (c == 'n') {
          c = '\n';
        } else if (c == 't') {
          c = '\t';
        } else if (c != '"' && c != '\\' && c != '/') {
          fail();
        }
      }
      out += c;
    }
    if (!take('"')) fail();
    return out;
  }
  Json value() {
    blanks();
    Json v;
    if (i_ >= s_.size()) fail();
    const char c = s_[i_];
    if (c == '{') {
      ++i_;
      v.kind = Json::kObject;
      if (take('}')) return v;
      do {
        blanks();
        const std::string key = string();
        if (!take(':')) fail();
        v.fields[key] = value();
      } while (take(','));
      if (!take('}')) fail();
    } else if (c == '[') {
      ++i_;
      v.kind = Json::kArray;
      if (take(']')) return v;
      do {
        v.items.push_back(value());
      } while (take(','));
      if (!take(']')) fail();
    } else if (c == '"') {
      v.kind = Json::kString;
      v.text = string();
    } else if (word("null")) {
      v.kind = Json::kNull;
    } else if (word("true") || word("false")) {
      v.kind = Json::kBool;
      v.boolean = s_[i_ - 1] == 'e' && s_[i_ - 2] == 'u';
    } else {
      const std::size_t start = i_;
      while (i_ < s_.size() && std::string_view("+-.0123456789eE").find(s_[i_]) != std::string_view::npos) ++i_;
      if (i_ == start) fail();
      std::size_t used = 0;
      v.number = std::stod(s_.substr(start, i_ - start), &used);
      if (used != i_ - start) fail();
      v.kind = Json::kNumber;
    }
    return v;
  }

  std::string s_;
  std::size_t i_ = 0;
};

Json read_json(const std::string& path) {
  std::ifstream in(path);
  std::stringstream all;
  all << in.rdbuf();
  return JsonReader(all.str()).document();
}

// Image of 96 lines x 128 samples with two targets, as the command tests use it.
const Target2D kFirst{{"hamming", kHamming, 0.7}, {"uniform", kUniform, 0.85}, 40.3, 50.6, 0.25, 0.0, 2.0, 0.5};
const Target2D kSecond{{"hamming", kHamming, 0.7}, {"hamming", kHamming, 0.85}, 60.8, 90.15, 0.25, 0.0, 1.0, -1.0};

std::vector<fcomplex> command_image() {
  std::vector<fcomplex> image(96 * 128);
  add_target(image, 96, 128, kFirst);
  add_target(image, 96, 128, kSecond);
  return image;
}

}  // namespace

TEST_F(Analyser, CommandPrintsTheTableAndWritesJsonAndFigures) {
  const std::string raster = scratch("two_targets.slc");
  write_raster(raster, command_image(), 96, 128, sar::io::kBigEndian, true);
  const std::string json = scratch("two_targets.json");
  const std::string prefix = scratch("plots/two_targets");
  std::filesystem::remove_all(std::filesystem::path(prefix).parent_path());
  std::filesystem::create_directories(std::filesystem::path(prefix).parent_path());
  std::string out;
  std::string err;
  const int status =
      run({raster, "--target", "41,51", "--target", "60,89", "--target", "500,20", "--json", json, "--profiles",
           "--azimuth-spacing", "4", "--range-spacing", "7.8", "--plot", prefix},
          out, err);
  ASSERT_EQ(status, 0) << err;
  EXPECT_NE(out.find("96 lines x 128 samples"), std::string::npos) << out;
  EXPECT_NE(out.find("target_1"), std::string::npos);
  EXPECT_NE(out.find("40.300"), std::string::npos) << out;
  EXPECT_NE(out.find("500.000     20.000  not measured: expected position outside the image"), std::string::npos)
      << out;
  EXPECT_NE(out.find("Range profile: 128 samples"), std::string::npos) << out;

  const Json doc = read_json(json);
  EXPECT_EQ(doc["lines"].number, 96.0);
  ASSERT_EQ(doc["targets"].items.size(), 3u);
  const Json& t1 = doc["targets"][0];
  EXPECT_TRUE(t1["valid"].boolean);
  EXPECT_NEAR(t1["peak_line"].number, kFirst.line, 0.01);
  EXPECT_NEAR(t1["peak_sample"].number, kFirst.sample, 0.01);
  EXPECT_NEAR(t1["offset_sample"].number, kFirst.sample - 51.0, 0.01);
  const double res_az = reference(kFirst.az, 10.0).width;
  EXPECT_NEAR(t1["azimuth"]["resolution_px"].number, res_az, 0.01 * res_az);
  EXPECT_NEAR(t1["azimuth"]["resolution_m"].number, 4.0 * t1["azimuth"]["resolution_px"].number, 1e-6);
  EXPECT_NEAR(t1["range"]["resolution_m"].number, 7.8 * t1["range"]["resolution_px"].number, 1e-6);
  EXPECT_NEAR(doc["targets"][1]["peak_line"].number, kSecond.line, 0.01);
  EXPECT_FALSE(doc["targets"][2]["valid"].boolean);
  EXPECT_EQ(doc["targets"][2]["problem"].text, "expected position outside the image");
  EXPECT_EQ(doc["profiles"]["range"]["mean_power_per_index"].items.size(), 128u);
  EXPECT_EQ(doc["profiles"]["azimuth"]["count"].number, 96.0);

  // Figures: PNGs with gnuplot, otherwise the data, the script and a message.
  EXPECT_TRUE(std::filesystem::exists(prefix + ".gp"));
  EXPECT_TRUE(std::filesystem::exists(prefix + "_target_1_range.dat"));
  EXPECT_TRUE(std::filesystem::exists(prefix + "_profile_azimuth.dat"));
  if (an::find_on_path("gnuplot").empty()) {
    EXPECT_NE(out.find("gnuplot is not on PATH"), std::string::npos) << out;
  } else {
    EXPECT_TRUE(std::filesystem::exists(prefix + "_target_1_azimuth.png")) << out;
  }
}

TEST_F(Analyser, CommandTakesTruthFilesListsAndHeaderlessRasters) {
  const std::string raster = scratch("headerless.slc");
  write_raster(raster, command_image(), 96, 128, sar::io::kLittleEndian, false);
  // Truth in raw coordinates: the image starts at raw line 1000, raw sample 2000.
  const std::string truth = scratch("headerless_truth.txt");
  {
    std::ofstream t(truth);
    t << "Truth of a simulated product.\n\n[acquisition]\nsampling_frequency = 19207680.000\n\n"
         "[target_1]\nazimuth_line = 1040.100000\nrange_sample = 2050.900000\n\n"
         "[target_2]\nazimuth_line = 1060.500000\nrange_sample = 2090.000000\n";
  }
  const std::string list = scratch("headerless_list.txt");
  {
    std::ofstream l(list);
    l << "# line sample name\n1041, 2051 listed\n\n";
  }
  const std::string json = scratch("headerless.json");
  std::string out;
  std::string err;
  ASSERT_EQ(run({raster, "--lines", "96", "--byte-order", "LSBFirst", "--truth", truth, "--targets", list,
                 "--first-line", "1000", "--first-sample", "2000", "--json", json},
                out, err),
            0)
      << err;
  const Json doc = read_json(json);
  EXPECT_EQ(doc["samples"].number, 128.0);
  ASSERT_EQ(doc["targets"].items.size(), 3u);
  EXPECT_EQ(doc["targets"][0]["name"].text, "listed");
  EXPECT_EQ(doc["targets"][1]["name"].text, "target_1");
  for (std::size_t i = 0; i < 2; ++i) {
    EXPECT_NEAR(doc["targets"][i]["peak_line"].number, kFirst.line, 0.01);
    EXPECT_NEAR(doc["targets"][i]["peak_sample"].number, kFirst.sample, 0.01);
  }
  EXPECT_NEAR(doc["targets"][1]["expected_line"].number, 40.1, 1e-9);
  EXPECT_NEAR(doc["targets"][1]["offset_line"].number, 0.2, 0.01);
  EXPECT_NEAR(doc["targets"][2]["peak_sample"].number, kSecond.sample, 0.01);
  // The range spacing of the truth's sampling frequency gives metres.
  const double spacing = 299792458.0 / (2.0 * 19207680.0);
  EXPECT_NEAR(doc["spacing_m"]["range"].number, spacing, 1e-6);
  EXPECT_NEAR(doc["targets"][1]["range"]["resolution_m"].number,
              spacing * doc["targets"][1]["range"]["resolution_px"].number, 1e-6);
  EXPECT_EQ(doc["spacing_m"]["azimuth"].kind, Json::kNull);
}

TEST_F(Analyser, CommandRefusesBadInputsWithAMessage) {
  const std::string raster = scratch("refusals.slc");
  write_raster(raster, command_image(), 96, 128, sar::io::kLittleEndian, true);
  const std::string bare = scratch("refusals_bare.slc");
  write_raster(bare, command_image(), 96, 128, sar::io::kLittleEndian, false);
  const std::string junk_header = scratch("refusals_junk.slc");
  write_raster(junk_header, command_image(), 96, 128, sar::io::kLittleEndian, false);
  {
    std::ofstream h(junk_header + ".hdr", std::ios::binary);
    for (int i = 0; i < 300; ++i) h.put(static_cast<char>((i * 97 + 5) & 0xff));
  }
  const std::string bad_truth = scratch("refusals_truth.txt");
  {
    std::ofstream t(bad_truth);
    t << "[target_1]\nazimuth_line = 12x\nrange_sample = 5\n";
  }
  const std::string empty_truth = scratch("refusals_empty_truth.txt");
  {
    std::ofstream t(empty_truth, std::ios::binary);
    t << std::string("\0\xff[tar\n=\n[[]]=", 14);
  }
  const std::string bad_list = scratch("refusals_list.txt");
  {
    std::ofstream l(bad_list);
    l << "10 20\n10 twenty\n";
  }
  struct Case {
    std::vector<std::string> args;
    int status;
    std::string message;
  };
  const std::vector<Case> cases = {
      {{}, 2, "no raster given"},
      {{raster}, 2, "nothing to measure"},
      {{raster, "--bogus"}, 2, "unknown option --bogus"},
      {{raster, "--target", "10"}, 2, "--target takes LINE,SAMPLE, not '10'"},
      {{raster, "--target", "1,2", "--oversample", "8"}, 2, "--oversample takes a whole number from 16"},
      {{raster, "--target", "1,2", "--cell-type", "NOSUCH"}, 2, "--cell-type takes a cell type name"},
      {{raster, "--target", "1,2", "--byte-order", "big"}, 2, "--byte-order takes LSBFirst or MSBFirst"},
      {{raster, "--target", "1,2", "--islr-span", "0.5"}, 2, "--islr-span"},
      {{raster, "--target", "1,2", "--json"}, 2, "--json needs a value"},
      {{raster, raster, "--profiles"}, 2, "more than one raster"},
      {{scratch("missing.slc"), "--profiles"}, 1, "cannot read raster"},
      {{bare, "--profiles"}, 1, "no header"},
      {{junk_header, "--profiles"}, 1, "cannot read the raster header"},
      {{bare, "--samples", "100", "--profiles"}, 1, "not a whole number of lines"},
      {{bare, "--lines", "96", "--cell-type", "FLOAT32", "--profiles"}, 1, "is not complex"},
      {{bare, "--lines", "96", "--samples", "200", "--profiles"}, 1, "its layout needs"},
      {{raster, "--truth", bad_truth}, 1, "azimuth_line missing or not a number"},
      {{raster, "--truth", empty_truth}, 1, "no [target_1] section"},
      {{raster, "--truth", scratch("no_truth.txt")}, 1, "no truth file"},
      {{raster, "--targets", bad_list}, 1, "refusals_list.txt:2: expected LINE SAMPLE [NAME]"},
      {{raster, "--target", "1,2", "--json", scratch("no_dir/x.json")}, 1, "cannot write"},
  };
  for (const Case& c : cases) {
    std::string out;
    std::string err;
    std::string line;
    for (const std::string& a : c.args) line += a + " ";
    EXPECT_EQ(run(c.args, out, err), c.status) << line << err;
    EXPECT_NE(err.find(c.message), std::string::npos) << line << "\n" << err;
    // A refused command is one line that points to the help.
    if (c.status == 2) {
      EXPECT_EQ(err.find('\n'), err.size() - 1) << err;
      EXPECT_NE(err.find("; see sarirf --help"), std::string::npos) << err;
    }
  }
  // The help names every option.
  std::string out;
  std::string err;
  ASSERT_EQ(run({"--help"}, out, err), 0);
  for (const char* option : {"--target", "--targets", "--truth", "--first-line", "--first-sample", "--offset", "--lines",
                             "--samples", "--byte-order", "--cell-type", "--header-offset", "--row-prefix",
                             "--azimuth-spacing", "--range-spacing", "--oversample", "--search", "--neighbourhood",
                             "--cut", "--max-cut", "--islr-span", "--profiles", "--json", "--plot", "Exit status"})
    EXPECT_NE(out.find(option), std::string::npos) << option;
}

TEST_F(Analyser, PowerProfilesAverageColumnsAndLines) {
  const int lines = 37;
  const int samples = 53;
  std::vector<fcomplex> image(static_cast<std::size_t>(lines * samples));
  std::vector<double> ga(lines);
  std::vector<double> gr(samples);
  for (int l = 0; l < lines; ++l) ga[static_cast<std::size_t>(l)] = 1.0 + 0.5 * std::cos(2.0 * kPi * l / 9.0);
  for (int s = 0; s < samples; ++s) gr[static_cast<std::size_t>(s)] = 0.2 + s / 40.0;
  double mean_a = 0.0;
  double mean_r = 0.0;
  for (const double g : ga) mean_a += g * g / lines;
  for (const double g : gr) mean_r += g * g / samples;
  for (int l = 0; l < lines; ++l) {
    for (int s = 0; s < samples; ++s) {
      image[static_cast<std::size_t>(l * samples + s)] =
          fcomplex(std::polar(ga[static_cast<std::size_t>(l)] * gr[static_cast<std::size_t>(s)], 0.37 * l * s));
    }
  }
  const an::PowerProfiles p = an::power_profiles(an::ComplexImageView{image, lines, samples, samples, 0, 0});
  ASSERT_EQ(p.range.size(), static_cast<std::size_t>(samples));
  ASSERT_EQ(p.azimuth.size(), static_cast<std::size_t>(lines));
  for (int s = 0; s < samples; ++s) {
    EXPECT_NEAR(p.range[static_cast<std::size_t>(s)], gr[static_cast<std::size_t>(s)] * gr[static_cast<std::size_t>(s)] * mean_a, 1e-5);
  }
  for (int l = 0; l < lines; ++l) {
    EXPECT_NEAR(p.azimuth[static_cast<std::size_t>(l)], ga[static_cast<std::size_t>(l)] * ga[static_cast<std::size_t>(l)] * mean_r, 1e-5);
  }
  // The same read from a file in blocks that do not divide the lines.
  const std::string raster = scratch("profiles.slc");
  write_raster(raster, image, lines, samples, sar::io::kBigEndian, true);
  an::RasterReader reader(raster, an::resolve_layout(raster, {}));
  const an::PowerProfiles q = reader.power_profiles(8);
  ASSERT_EQ(q.azimuth.size(), p.azimuth.size());
  for (std::size_t i = 0; i < p.range.size(); ++i) EXPECT_NEAR(q.range[i], p.range[i], 1e-9 + 1e-9 * p.range[i]);
  for (std::size_t i = 0; i < p.azimuth.size(); ++i) EXPECT_NEAR(q.azimuth[i], p.azimuth[i], 1e-9 + 1e-9 * p.azimuth[i]);
}

TEST_F(Analyser, TargetParsersTakeWhatIsWellFormedOnly) {
  double l = 0.0;
  double s = 0.0;
  EXPECT_TRUE(an::parse_position("12.5,-3", l, s));
  EXPECT_EQ(l, 12.5);
  EXPECT_EQ(s, -3.0);
  for (const char* bad : {"", ",", "1,", ",2", "1;2", "1,2,3", "nan,1", "1,inf", "1e999,2", " 1,2"}) {
    EXPECT_FALSE(an::parse_position(bad, l, s)) << bad;
  }
  std::vector<an::ExpectedTarget> targets{{"a", 10.0, 20.0}};
  an::apply_mapping(targets, {-5.0, 2.5});
  EXPECT_EQ(targets[0].line, 5.0);
  EXPECT_EQ(targets[0].sample, 22.5);
  // Bytes that are no list at all.
  const std::string junk = scratch("junk_list.txt");
  {
    std::ofstream j(junk, std::ios::binary);
    for (int i = 0; i < 512; ++i) j.put(static_cast<char>((i * 73 + 11) & 0xff));
  }
  EXPECT_THROW(an::read_target_list(junk), std::runtime_error);
  EXPECT_THROW(an::read_truth_targets(junk), std::runtime_error);
}

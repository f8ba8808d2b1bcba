#include "multilook/strip_multilook.hpp"

#include <algorithm>
#include <cmath>
#include <filesystem>
#include <numbers>
#include <span>
#include <stdexcept>
#include <system_error>

#include <Eigen/Dense>

#include "base/convert.hpp"
#include "base/diagnostics.hpp"
#include "base/profile.hpp"
#include "geometry/geolocation.hpp"
#include "io/cell_types.hpp"
#include "io/data_file.hpp"
#include "multilook/strip_detect.hpp"
#include "base/constants.hpp"

namespace sar::multilook {

namespace fs = std::filesystem;

namespace {

constexpr int kRejected = 10;
constexpr double kLightSpeed = base::kSpeedOfLight;
constexpr double kHalfLightSpeed = 149896229.0;
constexpr std::size_t kTextSize = 512;

int get_double(const std::string& file, const char* section, const char* key, double& value, std::string& error) {
  double v[1] = {0.0};
  if (base::GetProfileDoubleArray(section, key, v, file) != base::kProfileOk || !std::isfinite(v[0])) {
    error = std::string("the annotation ") + file + " has no " + section + "." + key;
    return kRejected;
  }
  value = v[0];
  return 0;
}

int get_time(const std::string& file, const char* section, const char* key, double& value, std::string& error) {
  std::string text;
  if (base::GetMyProfileString(section, key, text, kTextSize, file) != base::kProfileOk || text.size() < 20) {
    error = std::string("the annotation ") + file + " has no " + section + "." + key;
    return kRejected;
  }
  if (text.front() == '"') text.erase(0, 1);
  if (!text.empty() && text.back() == '"') text.pop_back();
  value = base::ascii2sec85(text);
  return 0;
}

std::string time_text(double sec85) {
  std::string text;
  if (base::sec852myascii(sec85, text) != 0) return {};
  return text;
}

void remove_quietly(const std::string& path) {
  std::error_code ec;
  fs::remove(path, ec);
}

/// The SLC's annotation with the multilooked grid, written beside the output as R_hdr.
int write_annotation(const std::string& slcAnnotation, const std::string& outAnnotation, const SlcGrid& grid,
                     const StripMultilookRequest& req, const StripMultilookResult& res) {
  using namespace sar::base;
  const std::string part = outAnnotation + ".part";
  std::error_code ec;
  FreeProfile(part);
  fs::copy_file(slcAnnotation, part, fs::copy_options::overwrite_existing, ec);
  if (ec) return 1;
  const std::string& f = part;
  const char* p = "Processing";
  WriteMyProfileInt(p, "NAzimuthLooks", res.azimuthLooks, f);
  WriteMyProfileInt(p, "NRangeLooks", res.rangeLooks, f);
  WriteMyProfileDouble(p, "PixelSpacingRg", res.rangeSpacing, f);
  WriteMyProfileDouble(p, "PixelSpacingAz", grid.pixelSpacingAz * res.azimuthLooks, f);
  WriteMyProfileDouble(p, "AzimuthTimeStep", res.lineStep, f);
  WriteProfileDoubleArray(p, "FastTime", {&res.nearTime, 1}, f);
  WriteMyProfileStringQuote(p, "AzimuthStartTime", time_text(res.firstLineTime), f);
  WriteMyProfileStringQuote(p, "AzimuthStopTime", time_text(res.firstLineTime + res.lines * res.lineStep), f);
  if (req.groundRange) WriteProfileDoubleArray(p, "GroundRangeSlantTimeCoeff", res.groundSlantTime, f);
  if (!req.groundRange) {
    const double step = res.rangeLooks / grid.samplingRate;
    const std::array<double, 3> slantRange{res.nearTime * kHalfLightSpeed,
                                           (res.nearTime + (res.samples / 2) * step) * kHalfLightSpeed,
                                           (res.nearTime + res.samples * step) * kHalfLightSpeed};
    WriteProfileDoubleArray(p, "SlantRange", slantRange, f);
  }
  // The looks are taken: a further multilook of this image is not suggested.
  WriteMyProfileInt(p, "SuggestedAzimuthLooks", 1, f);
  WriteMyProfileInt(p, "SuggestedRangeLooks", 1, f);

  const char* r = "RasterInfo";
  WriteMyProfileStringQuote(r, "CellType", req.coherent ? "FLOAT_COMPLEX" : "FLOAT32", f);
  WriteMyProfileStringQuote(r, "DataUnits", req.coherent ? "SLC" : "AMPLITUDE", f);
  WriteMyProfileInt(r, "NrOfPixelsPerLine", res.samples, f);
  WriteMyProfileInt(r, "NrOfLinesPerImage", res.lines, f);
  std::vector<std::string> otherInfo;
  if (GetMyProfileStringMatrix(r, "OtherInfo", otherInfo, 2, 16, f, 128) == kProfileOk && otherInfo.size() == 32) {
    std::string& scene = otherInfo[31];
    if (const auto at = scene.rfind("|SLANT_RANGE"); req.groundRange && at != std::string::npos)
      scene.replace(at, std::string::npos, "|GROUND_RANGE");
    WriteMyProfileStringMatrix(r, "OtherInfo", otherInfo, 2, 16, f);
  }
  WriteMyProfileStringQuote("InitialGeometry", "Projection", req.groundRange ? "GROUND_RANGE" : "SLANT_RANGE", f);
  const int status = SyncProfile(f);
  FreeProfile(f);
  if (status != 0) {
    remove_quietly(part);
    return 1;
  }
  fs::rename(part, outAnnotation, ec);
  if (ec) {
    remove_quietly(part);
    return 1;
  }
  return 0;
}

int fail(StripMultilookResult& res, int status, std::string text) {
  res.error = std::move(text);
  base::report(status == kRejected ? base::kReportError : base::kReportFileIo, res.error);
  return status;
}

}  // namespace

int read_slc_grid(const std::string& a, SlcGrid& g, std::string& error) {
  using namespace sar::base;
  FreeProfile(a);  // a cached older copy would hide a rewritten annotation
  std::error_code ec;
  if (!fs::is_regular_file(a, ec)) {
    error = "the annotation " + a + " is missing";
    return kRejected;
  }
  int st = get_time(a, "Processing", "AzimuthStartTime", g.firstLineTime, error);
  if (!st) st = get_double(a, "Processing", "AzimuthTimeStep", g.lineStep, error);
  if (!st) st = get_double(a, "Processing", "FastTime", g.nearTime, error);
  if (!st) st = get_double(a, "ChannelInfo", "SamplingRate", g.samplingRate, error);
  if (!st) st = get_double(a, "Processing", "PixelSpacingRg", g.pixelSpacingRg, error);
  if (!st) st = get_double(a, "Processing", "PixelSpacingAz", g.pixelSpacingAz, error);
  if (!st) st = get_double(a, "ChannelInfo", "CarrierFrequency", g.carrierFrequency, error);
  if (!st && (!(g.lineStep > 0.0) || !(g.samplingRate > 0.0))) {
    error = "the annotation " + a + " has no usable line step or sampling rate";
    st = kRejected;
  }
  if (st) {
    FreeProfile(a);
    return st;
  }
  int32_t looks[1] = {1};
  if (GetMyProfileIntArray("Processing", "SuggestedAzimuthLooks", looks, a) == kProfileOk)
    g.suggestedAzimuthLooks = std::max(1, looks[0]);
  if (GetMyProfileIntArray("Processing", "SuggestedRangeLooks", looks, a) == kProfileOk)
    g.suggestedRangeLooks = std::max(1, looks[0]);
  std::string ignored;
  g.hasOrbit = get_time(a, "StateVectorData", "TimeFirst", g.orbitFirstTime, ignored) == 0 &&
               get_double(a, "StateVectorData", "TimeDelta", g.orbitStep, ignored) == 0 &&
               GetMyProfileDoubleMatrix("StateVectorData", "pos", g.positions, 5, 3, a) == kProfileOk &&
               GetMyProfileDoubleMatrix("StateVectorData", "vel", g.velocities, 5, 3, a) == kProfileOk &&
               g.orbitStep > 0.0 && g.carrierFrequency > 0.0;
  FreeProfile(a);
  return 0;
}

int ground_distances(const SlcGrid& g, double azimuthTime, double nearTime, double timeStep, int samples,
                     std::vector<double>& distance) {
  distance.assign(static_cast<std::size_t>(std::max(samples, 0)), 0.0);
  geometry::grpt_rec rec;
  for (std::size_t i = 0; i < 5; ++i) rec.state_vectors[i] = {g.positions[3 * i], g.positions[3 * i + 1], g.positions[3 * i + 2]};
  rec.t0 = g.orbitFirstTime;
  rec.dt = g.orbitStep;
  rec.azimuth_time = azimuthTime;
  rec.wavelength = kLightSpeed / g.carrierFrequency;
  rec.side = 1.0;
  rec.fdc = 0.0;
  geometry::Vec3 previous{};
  for (int i = 0; i < samples; ++i) {
    rec.tau = nearTime + i * timeStep;
    if (int st = geometry::gr_pt_lat_lon(rec)) return st;
    const geometry::Vec3 here{rec.x, rec.y, rec.z};
    if (i > 0) distance[static_cast<std::size_t>(i)] = distance[static_cast<std::size_t>(i - 1)] +
                                                    std::hypot(here[0] - previous[0], here[1] - previous[1], here[2] - previous[2]);
    previous = here;
  }
  return 0;
}

std::vector<double> ground_to_slant(const std::vector<double>& distance, double step) {
  std::vector<double> where;
  if (distance.size() < 2 || !(step > 0.0)) return where;
  for (std::size_t i = 1; i < distance.size(); ++i)
    if (!(distance[i] > distance[i - 1])) return where;
  const double total = distance.back();
  std::size_t i = 0;
  for (double g = 0.0; g <= total; g = static_cast<double>(where.size()) * step) {
    while (i + 2 < distance.size() && distance[i + 1] < g) ++i;
    const double w = (g - distance[i]) / (distance[i + 1] - distance[i]);
    where.push_back(static_cast<double>(i) + std::clamp(w, 0.0, 1.0));
  }
  return where;
}

std::array<double, 5> fit_ground_columns(const std::vector<double>& where, double nearTime, double slantStep,
                                         double& worst) {
  std::array<double, 5> c{};
  worst = 0.0;
  const Eigen::Index n = static_cast<Eigen::Index>(where.size());
  if (n == 0) return c;
  // Columns scaled to [0, 1] for the fit's conditioning, then the coefficients scaled back.
  const double span = std::max<double>(1.0, static_cast<double>(n - 1));
  Eigen::MatrixXd a(n, 5);
  Eigen::VectorXd y(n);
  for (Eigen::Index j = 0; j < n; ++j) {
    const double x = static_cast<double>(j) / span;
    double p = 1.0;
    for (int k = 0; k < 5; ++k, p *= x) a(j, k) = p;
    y(j) = where[static_cast<std::size_t>(j)] * slantStep;  // from the near time, s
  }
  const Eigen::VectorXd b = a.colPivHouseholderQr().solve(y);
  double scale = 1.0;
  for (int k = 0; k < 5; ++k, scale /= span) c[static_cast<std::size_t>(k)] = b(k) * scale;
  c[0] += nearTime;
  for (Eigen::Index j = 0; j < n; ++j) {
    double v = 0.0, p = 1.0;
    for (int k = 0; k < 5; ++k, p *= static_cast<double>(j)) v += c[static_cast<std::size_t>(k)] * p;
    worst = std::max(worst, std::fabs(v - (nearTime + y(j))));
  }
  return c;
}

void resample_power(const std::vector<double>& power, const std::vector<double>& where, std::vector<float>& amplitude) {
  // A 13-tap sinc under a Hann window: detected power is band-limited to twice the look band,
  // which the looked slant cells sample; linear interpolation would widen a point target.
  constexpr int kHalf = 6;
  amplitude.assign(where.size(), 0.0f);
  if (power.empty()) return;
  const int last = static_cast<int>(power.size()) - 1;
  for (std::size_t g = 0; g < where.size(); ++g) {
    const double x = std::clamp(where[g], 0.0, static_cast<double>(last));
    const int centre = static_cast<int>(std::floor(x));
    const double frac = x - centre;
    double sum = 0.0, weights = 0.0;
    for (int k = -kHalf + 1; k <= kHalf; ++k) {
      const double d = k - frac;
      const double sinc = std::fabs(d) < 1e-12 ? 1.0 : std::sin(std::numbers::pi * d) / (std::numbers::pi * d);
      const double hann = 0.5 + 0.5 * std::cos(std::numbers::pi * d / (kHalf + 1));
      const double w = sinc * hann;
      const int i = std::clamp(centre + k, 0, last);  // the edge sample repeats beyond the ends
      sum += w * power[static_cast<std::size_t>(i)];
      weights += w;
    }
    amplitude[g] = static_cast<float>(std::sqrt(std::max(0.0, weights != 0.0 ? sum / weights : 0.0)));
  }
}

int run_strip_multilook(const StripMultilookRequest& req, StripMultilookResult& res) {
  base::Frame frame("ATstripmlook::run");
  res = {};
  SlcGrid grid;
  if (int st = read_slc_grid(req.slc + "_hdr", grid, res.error)) return fail(res, st, res.error);
  const int fa = req.azimuthLooks == 0 && req.rangeLooks == 0 ? grid.suggestedAzimuthLooks : req.azimuthLooks;
  const int fr = req.azimuthLooks == 0 && req.rangeLooks == 0 ? grid.suggestedRangeLooks : req.rangeLooks;
  if (fr < 1) return fail(res, kRejected, "Fast Undersampling factor must be >=1");
  if (fa < 1) return fail(res, kRejected, "Slow Undersampling factor must be >=1");
  if (req.groundRange && (req.coherent || !grid.hasOrbit))
    return fail(res, kRejected, req.coherent ? "ground range needs detected looks"
                                             : "the annotation " + req.slc + "_hdr has no state vectors for ground range");

  io::DataFile in(req.slc);
  if (in.read_hdr(req.slc) != 0 || !in.is_complex() || in.lines < 1 || in.pixels < 1)
    return fail(res, kRejected, "the raster header of " + req.slc + " does not describe a complex image");
  {
    std::error_code ec;
    const auto size = fs::file_size(req.slc, ec);
    if (ec || in.raster_bytes() < 0 || static_cast<int64_t>(size) < in.raster_bytes())
      return fail(res, 1, "the SLC " + req.slc + " is shorter than its header says");
  }
  if (in.open(0) != 0) return fail(res, 1, "cannot read " + req.slc);

  res.azimuthLooks = fa;
  res.rangeLooks = fr;
  res.lineStep = grid.lineStep * fa;
  res.firstLineTime = grid.firstLineTime + 0.5 * (fa - 1) * grid.lineStep;
  res.nearTime = grid.nearTime + 0.5 * (fr - 1) / grid.samplingRate;
  res.rangeSpacing = grid.pixelSpacingRg * fr;
  const int lines = req.coherent ? in.lines / fa : looked_size(in.lines, fa);
  const int slantSamples = req.coherent ? in.pixels / fr : looked_size(in.pixels, fr);
  if (lines < 1 || slantSamples < 1) return fail(res, kRejected, "the image is smaller than one look");

  std::vector<double> where;  // ground cells on the slant cells
  if (req.groundRange) {
    std::vector<double> distance;
    const double centre = grid.firstLineTime + 0.5 * in.lines * grid.lineStep;
    if (int st = ground_distances(grid, centre, res.nearTime, fr / grid.samplingRate, slantSamples, distance))
      return fail(res, kRejected, "the slant cells cannot be located on the ground (status " + std::to_string(st) + ")");
    const double step = req.groundStep > 0.0 ? req.groundStep
                                             : distance.back() / std::max(1, slantSamples - 1);
    where = ground_to_slant(distance, step);
    if (where.empty()) return fail(res, kRejected, "the ground distances of the slant cells do not increase");
    res.rangeSpacing = step;
    double worst = 0.0;
    res.groundSlantTime = fit_ground_columns(where, res.nearTime, fr / grid.samplingRate, worst);
  }
  res.lines = lines;
  res.samples = req.groundRange ? static_cast<int>(where.size()) : slantSamples;

  const std::string part = req.output + ".part";
  io::DataFile out(part);
  out.lines = res.lines;
  out.pixels = res.samples;
  out.cellType = req.coherent ? io::kFloatComplex : io::kFloat32;
  out.headerOffset = 0;
  out.rowPrefix = 0;
  auto abandon = [&](std::string text) {
    out.close();
    remove_quietly(part);
    return fail(res, 1, std::move(text));
  };
  if (out.open(1) != 0) return abandon("cannot write " + part);

  const std::size_t width = static_cast<std::size_t>(in.pixels);
  std::vector<fcomplex> block(static_cast<std::size_t>(fa) * width);
  try {
    if (req.coherent) {
      std::vector<fcomplex> row(static_cast<std::size_t>(res.samples));
      for (int k = 0; k < lines; ++k) {
        io::BufferIO rd(&in, 0, in.pixels, k * fa, fa, io::kFloatComplex);
        if (rd.readbuffer(block.data()) != 0) return abandon("cannot read " + req.slc);
        presum_block(block, fa, in.pixels, fr, row);
        io::BufferIO wr(&out, 0, res.samples, k, 1, io::kFloatComplex);
        if (wr.writebuffer(row.data()) != 0) return abandon("cannot write " + part);
      }
    } else {
      RangeLookDetector detector(in.pixels, fr);
      std::vector<double> sum(static_cast<std::size_t>(slantSamples));
      std::vector<double> power(sum.size());
      std::vector<float> amplitude(sum.size());
      const auto cells = detector.cells();
      for (int k = 0; k < lines; ++k) {
        const int rows = std::min(fa, in.lines - k * fa);
        io::BufferIO rd(&in, 0, in.pixels, k * fa, rows, io::kFloatComplex);
        if (rd.readbuffer(block.data()) != 0) return abandon("cannot read " + req.slc);
        std::fill(sum.begin(), sum.end(), 0.0);
        for (int r = 0; r < rows; ++r)
          detector.add_line(std::span<const fcomplex>(block.data() + static_cast<std::size_t>(r) * width, width), sum);
        if (req.groundRange) {
          for (std::size_t m = 0; m < sum.size(); ++m) power[m] = sum[m] / (static_cast<double>(rows) * cells[m]);
          resample_power(power, where, amplitude);
        } else {
          for (std::size_t m = 0; m < sum.size(); ++m) amplitude[m] = look_amplitude(sum[m], rows, cells[m]);
        }
        io::BufferIO wr(&out, 0, res.samples, k, 1, io::kFloat32);
        if (wr.writebuffer(amplitude.data()) != 0) return abandon("cannot write " + part);
      }
    }
  } catch (const std::exception& e) {
    return abandon(std::string("multilook failed: ") + e.what());
  }
  in.close();
  if (out.close() != 0) return abandon("cannot write " + part);

  std::error_code ec;
  fs::rename(part, req.output, ec);
  if (ec) return abandon("cannot rename " + part + ": " + ec.message());
  io::DataFile header(req.output);
  header.lines = res.lines;
  header.pixels = res.samples;
  header.cellType = out.cellType;
  header.byteOrder = out.byteOrder;
  remove_quietly(req.output + ".hdr");  // a header of an earlier run would set the dialect
  if (header.write_hdr() != 0 || write_annotation(req.slc + "_hdr", req.output + "_hdr", grid, req, res) != 0) {
    for (const char* suffix : {"", ".hdr", ".vrt", "_hdr"}) remove_quietly(req.output + suffix);
    return fail(res, 1, "cannot write the description of " + req.output);
  }
  return 0;
}

}  // namespace sar::multilook

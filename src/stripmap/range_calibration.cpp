#include "stripmap/range_calibration.hpp"

#include <algorithm>
#include <cmath>
#include <cstdio>
#include <memory>

#include "base/diagnostics.hpp"

namespace sar::stripmap {

namespace {

constexpr double kDegree = 0.017453292519943295;
constexpr double kDegreesPerRadian = 57.29577951308232;

/// a0 + a1 t + a2 t^2 + a3 t^3 + a4 t^4 of the five used coefficients.
double angle_at(std::span<const double> c, double t) {
  return c[0] + t * (c[1] + t * (c[2] + t * (c[3] + t * c[4])));
}

/// The five coefficients of a stripmap angle polynomial (a0, a1, a4, a5, a6) in radians.
std::array<double, 5> used_coefficients(const DopplerPoly& p) {
  return {p[0] * kDegree, p[1] * kDegree, p[4] * kDegree, p[5] * kDegree, p[6] * kDegree};
}

struct FileCloser {
  void operator()(std::FILE* f) const { std::fclose(f); }
};

}  // namespace

int InterpRgAnt(const procparm& proc, std::span<const double> coeff, double fs, std::span<double> out) {
  const int n = static_cast<int>(proc.pattern.size());
  if (n < 2 || !(proc.patternStep != 0.0) || coeff.size() < 5 || !(fs > 0.0)) return 10;
  const int m = n / 2;
  for (std::size_t i = 0; i < out.size(); ++i) {
    const double theta = kDegreesPerRadian * angle_at(coeff, static_cast<double>(i) / fs);
    const double g = (theta - proc.patternCentre) / proc.patternStep;
    if (g == std::floor(g) && g > -m && g < n - m - 1) {
      out[i] = 1.0 / proc.pattern[static_cast<std::size_t>(static_cast<int>(g) + m)];
      continue;
    }
    int base;
    if (g <= -m) base = -m;
    else if (g >= n - m - 1) base = n - m - 2;
    else base = static_cast<int>(std::floor(g));
    const double a = proc.pattern[static_cast<std::size_t>(base + m)];
    const double b = proc.pattern[static_cast<std::size_t>(base + m + 1)];
    out[i] = 1.0 / ((b - a) * (static_cast<float>(g) - static_cast<float>(base)) + a);
  }
  return 0;
}

int IncidCompCoeff(std::span<const double> coeff, double fs, std::span<double> out, double tNear) {
  if (coeff.size() < 5 || !(fs > 0.0) || !(tNear > 0.0)) return 10;
  for (std::size_t i = 0; i < out.size(); ++i) {
    const double t = static_cast<double>(i) / fs;
    const double theta = angle_at(coeff, t);
    out[i] = std::pow(1.0 + t / tNear, 1.5) * std::sqrt(std::max(0.0, std::sin(theta)));
  }
  return 0;
}

std::vector<double> range_calibration_gain(const metadata::sarpar& par, const procparm& proc, int samples) {
  std::vector<double> g(static_cast<std::size_t>(std::max(samples, 0))), h(g.size());
  const auto look = used_coefficients(proc.lookAngle);
  const auto incidence = used_coefficients(proc.incidenceAngle);
  if (InterpRgAnt(proc, look, par.samplingRate, g) != 0 ||
      IncidCompCoeff(incidence, par.samplingRate, h, par.nearRangeTime) != 0)
    return {};
  for (std::size_t i = 0; i < g.size(); ++i) g[i] *= h[i];
  return g;
}

void apply_range_gain(std::span<std::complex<float>> rows, int lines, int pitch, std::span<const double> gain) {
  for (int l = 0; l < lines; ++l) {
    std::complex<float>* row = rows.data() + static_cast<std::size_t>(l) * pitch;
    for (std::size_t i = 0; i < gain.size(); ++i) row[i] *= static_cast<float>(gain[i]);
  }
}

int range_antenna_calibration(const metadata::sarpar& par, procparm& proc) {
  base::Frame frame("IMCalibration");
  if (proc.progressFlag) std::printf("\nRANGE ANTENNA CALIBRATION started... \n");
  const int samples = proc.rangeSamples, lines = proc.lines;
  const std::vector<double> gain = range_calibration_gain(par, proc, samples);
  if (gain.empty() || samples < 1 || lines < 0) {
    base::report(base::kReportError, "range antenna calibration: no pattern or no angle geometry");
    return frame.check(10);
  }
  if (proc.Flag_incore) {
    if (proc.matrix.size() < static_cast<std::size_t>(lines) * samples) return frame.check(10);
    apply_range_gain(proc.matrix, lines, samples, gain);
    return 0;
  }
  std::unique_ptr<std::FILE, FileCloser> file(std::fopen(par.rgfPath.c_str(), "r+b"));
  if (!file) {
    base::report(base::kReportFileIo, "cannot open " + par.rgfPath + " for update");
    return frame.check(1);
  }
  const int block = std::max(1, proc.Azblk);
  std::vector<std::complex<float>> buffer(static_cast<std::size_t>(block) * samples);
  const int blocks = (lines + block - 1) / block;
  for (int b = 0; b < blocks; ++b) {
    const int n = std::min(block, lines - b * block);
    if (proc.progressFlag) std::printf("Compensating block %d of %d \r", b + 1, blocks);
    const long long offset = static_cast<long long>(b) * block * samples * 8;
    const std::size_t count = static_cast<std::size_t>(n) * samples;
    if (fseeko(file.get(), static_cast<off_t>(offset), SEEK_SET) != 0 ||
        std::fread(buffer.data(), 8, count, file.get()) != count) {
      base::report(base::kReportFileIo, "cannot read " + par.rgfPath);
      return frame.check(1);
    }
    apply_range_gain(buffer, n, samples, gain);
    if (fseeko(file.get(), static_cast<off_t>(offset), SEEK_SET) != 0 ||
        std::fwrite(buffer.data(), 8, count, file.get()) != count) {
      base::report(base::kReportFileIo, "cannot write " + par.rgfPath);
      return frame.check(1);
    }
  }
  if (std::fflush(file.get()) != 0) return frame.check(1);
  return 0;
}

}  // namespace sar::stripmap

#pragma once
// Estimator settings and image descriptions for the Doppler tests, and readers of the result
// file.
#include <cmath>
#include <cstdint>
#include <string>
#include <vector>

#include "base/profile.hpp"
#include "doppler/dcest.hpp"
#include "scene_generator.hpp"

namespace sar::doppler::testing {

inline constexpr double kLight = 299792458.0;

/// Settings for image mode data. The look filters have 33 taps: with fewer, the leakage
/// between the two looks of homogeneous clutter beats at zero frequency and outweighs the
/// random beat, so that MLBF answers "no range walk" everywhere. Kthr keeps only beat spectra
/// whose peak stands out, Varthr accepts the natural spread of WDAR block estimates (about one
/// PRF per block of 256 x 512 samples with this antenna).
inline dcestconf estimator_config() {
  dcestconf c;
  c.Memory = 1 << 30;
  c.RgBand = 0.8;
  c.Blocks = 256;
  c.Blockl = 512;
  c.AnLen = 10.0;
  c.Kthr = 1.6;
  c.Lookbf = 0.2;
  c.Lookbt = 0.05;
  c.Lookrp = 1.0;
  c.Lookrs = 1.0;
  c.Decfac = 4;
  c.Flength = 33;
  c.Dftstep = 1e-4;
  c.Fftrgprc = 0.01;
  c.Fftazprc = 0.01;
  c.Peakwid = 4e-3;
  c.Minamb = -4.0;
  c.Maxamb = 4.0;
  c.Sthr = 10.0;
  c.Nbestblocks = 8;
  c.Nummlbf = 4;
  c.Nwdarblocks = 128;
  c.Varthr = 1.0;
  c.Patchs = 32;
  c.Patchl = 64;
  c.Dswst = 32;
  c.Amb_flag = 1;
  c.Pol_Weights = {1, 1, 1, 0, 0, 0, 0};
  c.carrier = 5.331e9;
  c.fs = 19.20768e6;
  c.Flag_incore = 1;
  return c;
}

inline dcimage image_of(const SceneSpec& shape) {
  dcimage image;
  image.samples = shape.samples;
  image.lines = shape.lines;
  image.prf = shape.prf;
  image.platformSpeed = shape.speed;
  image.rangeTimeOrigin = 2.0 * shape.range / kLight;
  image.azimuthTimeOrigin = 1000.0;
  return image;
}

/// Centre of the scene in the polynomial's times.
inline double centre_range_time(const dcimage& image, double fs) { return image.rangeTimeOrigin + (image.samples / 2) / fs; }
inline double centre_azimuth_time(const dcimage& image) { return image.azimuthTimeOrigin + (image.lines / 2) / image.prf; }

/// Range derivative of the polynomial (Hz/s) at range time r.
inline double range_slope(const DopplerPoly& a, double r) {
  const double x = r - a[7];
  return a[1] + 2.0 * a[4] * x + 3.0 * a[5] * x * x + 4.0 * a[6] * x * x * x;
}

inline double wrap_half(double c) { return c - std::floor(c + 0.5); }

inline std::string resume_text(const std::string& path, const char* section, const char* key) {
  std::string value;
  base::GetMyProfileString(section, key, value, 256, path);
  return value;
}

inline int resume_int(const std::string& path, const char* section, const char* key) {
  int32_t v = -99999;
  base::GetMyProfileIntArray(section, key, std::span<int32_t>(&v, 1), path);
  return v;
}

inline double resume_double(const std::string& path, const char* section, const char* key) {
  double v = NAN;
  base::GetProfileDoubleArray(section, key, std::span<double>(&v, 1), path);
  return v;
}

/// An integer array whose length is not known in advance.
inline std::vector<int32_t> resume_ints(const std::string& path, const char* section, const char* key) {
  std::string text;
  base::GetMyProfileString(section, key, text, 4096, path);
  std::vector<int32_t> out;
  std::string token;
  for (char ch : text) {
    if (ch == '-' || (ch >= '0' && ch <= '9')) {
      token += ch;
    } else if (!token.empty()) {
      out.push_back(std::stoi(token));
      token.clear();
    }
  }
  if (!token.empty()) out.push_back(std::stoi(token));
  return out;
}

}  // namespace sar::doppler::testing

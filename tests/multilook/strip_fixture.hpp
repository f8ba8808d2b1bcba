#pragma once
// A small SLC on disk with its raster header and annotation, as the IM job leaves them.
#include <gtest/gtest.h>

#include <complex>
#include <filesystem>
#include <random>
#include <string>
#include <vector>

#include "../geometry/synthetic_orbit.hpp"
#include "base/convert.hpp"
#include "base/profile.hpp"
#include "io/cell_types.hpp"
#include "io/data_file.hpp"

namespace sar::multilook::testing {

using fcomplex = std::complex<float>;

struct SlcImage {
  int lines = 0;
  int samples = 0;
  std::vector<fcomplex> z;
  fcomplex& at(int l, int s) { return z[static_cast<std::size_t>(l) * samples + s]; }
};

/// Circular complex Gaussian clutter of unit mean power, independent from cell to cell.
inline SlcImage white_clutter(int lines, int samples, unsigned seed) {
  SlcImage im{lines, samples, std::vector<fcomplex>(static_cast<std::size_t>(lines) * samples)};
  std::mt19937 rng(seed);
  std::normal_distribution<float> n(0.0f, std::sqrt(0.5f));
  for (auto& v : im.z) v = {n(rng), n(rng)};
  return im;
}

inline double sinc(double x) { return x == 0.0 ? 1.0 : std::sin(M_PI * x) / (M_PI * x); }

/// A point target of the whole band at a fractional (line, sample) on a dark image.
inline SlcImage point_target(int lines, int samples, double line, double sample) {
  SlcImage im{lines, samples, std::vector<fcomplex>(static_cast<std::size_t>(lines) * samples)};
  for (int l = 0; l < lines; ++l)
    for (int s = 0; s < samples; ++s) im.at(l, s) = static_cast<float>(sinc(l - line) * sinc(s - sample));
  return im;
}

struct SlcOnDisk {
  std::string dir;
  std::string slc;
  double firstLine = 0.0;
  double lineStep = 1.0 / 1652.0;
  double nearTime = 5.5e-3;
  double fs = 19.207680e6;
  double spacingRg = 7.8;
  double spacingAz = 4.05;
};

/// Writes the raster, its header and its annotation under `dir`.
inline SlcOnDisk write_slc(const std::string& dir, const SlcImage& im, int suggestedAz = 1, int suggestedRg = 1) {
  namespace fs = std::filesystem;
  fs::create_directories(dir);
  SlcOnDisk d;
  d.dir = dir;
  d.slc = dir + "/scene_slc";
  {
    io::DataFile f(d.slc);
    f.lines = im.lines;
    f.pixels = im.samples;
    f.cellType = io::kFloatComplex;
    EXPECT_EQ(f.open(1), 0);
    io::BufferIO w(&f, 0, im.samples, 0, im.lines, io::kFloatComplex);
    EXPECT_EQ(w.writebuffer(im.z.data()), 0);
    EXPECT_EQ(f.close(), 0);
    EXPECT_EQ(f.write_hdr(), 0);
  }
  geometry::testing::CircularOrbit orbit;
  d.firstLine = orbit.t_ref + 10.0;
  const std::string a = d.slc + "_hdr";
  base::FreeProfile(a);
  std::string text;
  base::sec852myascii(d.firstLine, text);
  base::WriteMyProfileStringQuote("Processing", "AzimuthStartTime", text, a);
  base::WriteMyProfileDouble("Processing", "AzimuthTimeStep", d.lineStep, a);
  base::WriteProfileDoubleArray("Processing", "FastTime", {&d.nearTime, 1}, a);
  base::WriteMyProfileDouble("Processing", "PixelSpacingRg", d.spacingRg, a);
  base::WriteMyProfileDouble("Processing", "PixelSpacingAz", d.spacingAz, a);
  base::WriteMyProfileInt("Processing", "NAzimuthLooks", 1, a);
  base::WriteMyProfileInt("Processing", "NRangeLooks", 1, a);
  base::WriteMyProfileInt("Processing", "SuggestedAzimuthLooks", suggestedAz, a);
  base::WriteMyProfileInt("Processing", "SuggestedRangeLooks", suggestedRg, a);
  base::WriteProfileDoubleArray("ChannelInfo", "SamplingRate", {&d.fs, 1}, a);
  const double carrier = 5.331e9;
  base::WriteProfileDoubleArray("ChannelInfo", "CarrierFrequency", {&carrier, 1}, a);
  base::WriteMyProfileStringQuote("RasterInfo", "CellType", "FLOAT_COMPLEX", a);
  base::WriteMyProfileStringQuote("InitialGeometry", "Projection", "SLANT_RANGE", a);
  std::vector<double> pos, vel;
  for (int k = 0; k < 5; ++k) {
    const auto sv = orbit.earth_fixed(orbit.t_ref + k * 10.0);
    pos.insert(pos.end(), sv.position.begin(), sv.position.end());
    vel.insert(vel.end(), sv.velocity.begin(), sv.velocity.end());
  }
  base::sec852myascii(orbit.t_ref, text);
  base::WriteMyProfileStringQuote("StateVectorData", "TimeFirst", text, a);
  base::WriteMyProfileDouble("StateVectorData", "TimeDelta", 10.0, a);
  base::WriteMyProfileDoubleMatrix("StateVectorData", "pos", pos, 5, 3, a);
  base::WriteMyProfileDoubleMatrix("StateVectorData", "vel", vel, 5, 3, a);
  EXPECT_EQ(base::SyncProfile(a), 0);
  base::FreeProfile(a);
  return d;
}

/// A float raster as written, through its header.
inline std::vector<float> read_float_raster(const std::string& path, int& lines, int& samples) {
  io::DataFile f(path);
  if (f.read_hdr(path) != 0 || f.cellType != io::kFloat32) return {};
  lines = f.lines;
  samples = f.pixels;
  std::vector<float> v(static_cast<std::size_t>(lines) * samples);
  if (f.open(0) != 0) return {};
  io::BufferIO r(&f, 0, samples, 0, lines, io::kFloat32);
  if (r.readbuffer(v.data()) != 0) return {};
  return v;
}

inline std::string temp_dir(const std::string& name) {
  const auto d = std::filesystem::temp_directory_path() / ("sar_mlook_" + name + "_" + std::to_string(::getpid()));
  std::filesystem::remove_all(d);
  std::filesystem::create_directories(d);
  return d.string();
}

}  // namespace sar::multilook::testing

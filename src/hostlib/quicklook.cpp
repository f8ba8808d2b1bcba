#include "hostlib/quicklook.hpp"

#include <algorithm>
#include <cmath>
#include <filesystem>
#include <memory>
#include <string>
#include <vector>

#include "hostlib/gdal_support.hpp"

namespace sar::hostlib {
namespace {

double median_of(std::vector<float> values) {
  values.erase(std::remove_if(values.begin(), values.end(), [](float v) { return !(v > 0.0f); }), values.end());
  if (values.empty()) return 0.0;
  const auto mid = values.begin() + static_cast<std::ptrdiff_t>(values.size() / 2);
  std::nth_element(values.begin(), mid, values.end());
  return *mid;
}

/// One band of 8-bit grey, deflated in strips of about 64 KiB, 0 declared as no data, and tied
/// to WGS84 by the four outer pixel corners (near-early, far-early, near-late, far-late).
/// 0, or 1 when GDAL cannot create or finish the file.
int write_grey_tiff(const std::string& path, int width, int height, std::vector<uint8_t>& grey,
                    const QuickLookRequest& request) {
  gdal::register_drivers();
  const gdal::QuietErrors quiet;
  GDALDriverH driver = GDALGetDriverByName("GTiff");
  if (!driver) return 1;
  const std::string rowsPerStrip = "BLOCKYSIZE=" + std::to_string(std::max(1, 65536 / width));
  const char* const options[] = {"COMPRESS=DEFLATE", "PHOTOMETRIC=MINISBLACK", "INTERLEAVE=PIXEL",
                                 rowsPerStrip.c_str(), nullptr};
  gdal::Dataset ds(GDALCreate(driver, path.c_str(), width, height, 1, GDT_Byte, const_cast<char**>(options)));
  if (!ds) return 1;
  GDALRasterBandH band = GDALGetRasterBand(ds.get(), 1);
  if (!band || GDALSetRasterNoDataValue(band, 0.0) != CE_None) return 1;
  if (request.georeferenced) {
    const double w = width, h = height;
    const double at[4][2] = {{0.0, 0.0}, {w, 0.0}, {0.0, h}, {w, h}};
    GDAL_GCP gcps[4];
    GDALInitGCPs(4, gcps);
    for (std::size_t k = 0; k < 4; ++k) {
      gcps[k].dfGCPPixel = at[k][0];
      gcps[k].dfGCPLine = at[k][1];
      gcps[k].dfGCPX = request.corners[k].longitude;
      gcps[k].dfGCPY = request.corners[k].latitude;
      gcps[k].dfGCPZ = 0.0;
    }
    const gdal::Srs srs = gdal::wgs84();
    const CPLErr set = srs ? GDALSetGCPs2(ds.get(), 4, gcps, srs.get()) : CE_Failure;
    GDALDeinitGCPs(4, gcps);
    if (set != CE_None) return 1;
  }
  if (GDALRasterIO(band, GF_Write, 0, 0, width, height, grey.data(), width, height, GDT_Byte, 0, 0) != CE_None)
    return 1;
  CPLErrorReset();
  ds.reset();  // the strips and tags are on disk only once the dataset is closed
  return CPLGetLastErrorType() >= CE_Failure ? 1 : 0;
}

}  // namespace

std::array<int, 2> quicklook_size(int lines, int samples, const QuickLookRequest& r) {
  const double groundWidth = samples * std::max(r.rangeSpacing, 1e-9);
  const double groundHeight = lines * std::max(r.azimuthSpacing, 1e-9);
  const double fit = std::min(r.maxWidth / groundWidth, r.maxHeight / groundHeight);
  // Never more pixels than the input has.
  const int width = std::clamp(static_cast<int>(std::lround(groundWidth * fit)), 1, std::max(samples, 1));
  const int height = std::clamp(static_cast<int>(std::lround(groundHeight * fit)), 1, std::max(lines, 1));
  return {width, height};
}

int write_quicklook_geotiff(const std::string& outPath, int lines, int samples, const ComplexRowSource& source,
                            const QuickLookRequest& request, QuickLookResult* result) {
  if (lines <= 0 || samples <= 0 || request.maxWidth <= 0 || request.maxHeight <= 0) return 10;
  const auto [width, height] = quicklook_size(lines, samples, request);

  // Mean power per output pixel, accumulated line by line: one input row in memory at a time.
  std::vector<double> power(static_cast<std::size_t>(width) * height, 0.0);
  std::vector<uint32_t> counts(power.size(), 0);
  std::vector<std::complex<float>> row(static_cast<std::size_t>(samples));
  std::vector<int> column(static_cast<std::size_t>(samples));
  for (int s = 0; s < samples; ++s) column[static_cast<std::size_t>(s)] = static_cast<int>(int64_t(s) * width / samples);
  for (int l = 0; l < lines; ++l) {
    if (!source(l, row)) return 10;
    const std::size_t base = static_cast<std::size_t>(int64_t(l) * height / lines) * width;
    for (int s = 0; s < samples; ++s) {
      const std::complex<float> z = row[static_cast<std::size_t>(s)];
      if (!std::isfinite(z.real()) || !std::isfinite(z.imag())) continue;
      const std::size_t o = base + static_cast<std::size_t>(column[static_cast<std::size_t>(s)]);
      power[o] += static_cast<double>(std::norm(z));
      ++counts[o];
    }
  }
  std::vector<float> amplitude(power.size(), 0.0f);
  for (std::size_t i = 0; i < power.size(); ++i)
    if (counts[i]) amplitude[i] = static_cast<float>(std::sqrt(power[i] / counts[i]));

  // The median amplitude, not the mean, sets the grey level: a few bright targets must not
  // darken the whole scene.
  const double median = median_of(amplitude);
  const double gain = median > 0.0 ? request.scale * request.maxValue / (4.0 * median) : 0.0;
  std::vector<uint8_t> grey(amplitude.size(), 0);
  for (std::size_t i = 0; i < amplitude.size(); ++i) {
    if (!counts[i]) continue;  // no data stays 0
    grey[i] = static_cast<uint8_t>(std::clamp(std::lround(amplitude[i] * gain), 1L, long(request.maxValue)));
  }

  const std::string tmpPath = outPath + ".part";
  if (write_grey_tiff(tmpPath, width, height, grey, request) != 0) {
    std::error_code ec;
    std::filesystem::remove(tmpPath, ec);
    return 10;
  }
  // The quick-look appears under its name only when complete.
  std::error_code ec;
  std::filesystem::rename(tmpPath, outPath, ec);
  if (ec) {
    std::filesystem::remove(tmpPath, ec);
    return 10;
  }
  if (result) *result = {width, height, median};
  return 0;
}

}  // namespace sar::hostlib

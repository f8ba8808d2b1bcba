#include "hostlib/quicklook.hpp"

#include <geotiff/geotiff.h>
#include <geotiff/geovalues.h>
#include <geotiff/xtiffio.h>

#include <algorithm>
#include <cmath>
#include <filesystem>
#include <memory>
#include <vector>

namespace sar::hostlib {
namespace {

struct TiffCloser {
  void operator()(TIFF* t) const {
    if (t) XTIFFClose(t);
  }
};
struct GtifFree {
  void operator()(GTIF* g) const {
    if (g) GTIFFree(g);
  }
};

double median_of(std::vector<float> values) {
  values.erase(std::remove_if(values.begin(), values.end(), [](float v) { return !(v > 0.0f); }), values.end());
  if (values.empty()) return 0.0;
  const auto mid = values.begin() + static_cast<std::ptrdiff_t>(values.size() / 2);
  std::nth_element(values.begin(), mid, values.end());
  return *mid;
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
  {
    std::unique_ptr<TIFF, TiffCloser> tif(XTIFFOpen(tmpPath.c_str(), "w"));
    if (!tif) return 10;
    TIFF* t = tif.get();
    TIFFSetField(t, TIFFTAG_IMAGEWIDTH, static_cast<uint32_t>(width));
    TIFFSetField(t, TIFFTAG_IMAGELENGTH, static_cast<uint32_t>(height));
    TIFFSetField(t, TIFFTAG_BITSPERSAMPLE, 8);
    TIFFSetField(t, TIFFTAG_SAMPLESPERPIXEL, 1);
    TIFFSetField(t, TIFFTAG_SAMPLEFORMAT, SAMPLEFORMAT_UINT);
    TIFFSetField(t, TIFFTAG_PHOTOMETRIC, PHOTOMETRIC_MINISBLACK);
    TIFFSetField(t, TIFFTAG_PLANARCONFIG, PLANARCONFIG_CONTIG);
    TIFFSetField(t, TIFFTAG_COMPRESSION, COMPRESSION_ADOBE_DEFLATE);
    TIFFSetField(t, TIFFTAG_ROWSPERSTRIP, static_cast<uint32_t>(std::max(1, 65536 / width)));
    // GDAL's no-data tag is not one libtiff knows; register it for this file.
    static const TIFFFieldInfo kNoData[] = {
        {TIFFTAG_GDAL_NODATA, -1, -1, TIFF_ASCII, FIELD_CUSTOM, 1, 0, const_cast<char*>("GDALNoDataValue")}};
    TIFFMergeFieldInfo(t, kNoData, 1);
    TIFFSetField(t, TIFFTAG_GDAL_NODATA, "0");
    if (request.georeferenced) {
      // Four tie points at the outer pixel corners: (i, j, 0) -> (lon, lat, 0).
      const double w = width, h = height;
      const auto& c = request.corners;
      const double ties[24] = {0, 0, 0, c[0].longitude, c[0].latitude, 0, w, 0, 0, c[1].longitude, c[1].latitude, 0,
                               0, h, 0, c[2].longitude, c[2].latitude, 0, w, h, 0, c[3].longitude, c[3].latitude, 0};
      TIFFSetField(t, TIFFTAG_GEOTIEPOINTS, 24, ties);
      std::unique_ptr<GTIF, GtifFree> gtif(GTIFNew(t));
      if (!gtif) return 10;
      GTIFKeySet(gtif.get(), GTModelTypeGeoKey, TYPE_SHORT, 1, ModelTypeGeographic);
      GTIFKeySet(gtif.get(), GTRasterTypeGeoKey, TYPE_SHORT, 1, RasterPixelIsArea);
      GTIFKeySet(gtif.get(), GeographicTypeGeoKey, TYPE_SHORT, 1, GCS_WGS_84);
      GTIFKeySet(gtif.get(), GeogAngularUnitsGeoKey, TYPE_SHORT, 1, Angular_Degree);
      GTIFWriteKeys(gtif.get());
    }
    for (int y = 0; y < height; ++y) {
      if (TIFFWriteScanline(t, grey.data() + static_cast<std::size_t>(y) * width, static_cast<uint32_t>(y), 0) < 0) {
        tif.reset();
        std::filesystem::remove(tmpPath);
        return 10;
      }
    }
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

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

namespace {

// Adds lines [b0, b1) (rows(l) points at line l) to the grid: each output row by one thread,
// its lines in order, so the sums do not depend on the thread count.
template <class Rows>
void add_lines(QuickLookGrid& g, int b0, int b1, const Rows& rows) {
  const auto row_of = [&](int l) { return static_cast<int>(int64_t(l) * g.height / g.lines); };
  const int r0 = row_of(b0), r1 = row_of(b1 - 1);
#pragma omp parallel for schedule(dynamic)
  for (int r = r0; r <= r1; ++r) {
    const std::size_t base = static_cast<std::size_t>(r) * g.width;
    // The first line of output row r is the least l with l height >= r lines.
    const auto first = static_cast<int>((int64_t(r) * g.lines + g.height - 1) / g.height);
    for (int l = std::max(b0, first); l < b1 && row_of(l) == r; ++l) {
      const std::complex<float>* row = rows(l);
      // The samples of one output column are consecutive: each run is summed on its own.
      for (int s = 0; s < g.samples;) {
        const int c = g.column[static_cast<std::size_t>(s)];
        double sum = 0.0;
        uint32_t n = 0;
        for (; s < g.samples && g.column[static_cast<std::size_t>(s)] == c; ++s) {
          const std::complex<float> z = row[s];
          if (!std::isfinite(z.real()) || !std::isfinite(z.imag())) continue;
          sum += static_cast<double>(std::norm(z));
          ++n;
        }
        g.power[base + static_cast<std::size_t>(c)] += sum;
        g.counts[base + static_cast<std::size_t>(c)] += n;
      }
    }
  }
}

}  // namespace

int QuickLookGrid::start(int lines_, int samples_, const QuickLookRequest& request) {
  if (lines_ <= 0 || samples_ <= 0 || request.maxWidth <= 0 || request.maxHeight <= 0) return 10;
  lines = lines_;
  samples = samples_;
  const auto size = quicklook_size(lines, samples, request);
  width = size[0];
  height = size[1];
  power.assign(static_cast<std::size_t>(width) * height, 0.0);
  counts.assign(power.size(), 0);
  column.resize(static_cast<std::size_t>(samples));
  for (int s = 0; s < samples; ++s) column[static_cast<std::size_t>(s)] = static_cast<int>(int64_t(s) * width / samples);
  return 0;
}

void quicklook_add(QuickLookGrid& grid, int first, int count, const std::complex<float>* lines, std::int64_t pitch) {
  const int end = std::min(grid.lines, first + count);
  if (!lines || first < 0 || first >= end) return;
  add_lines(grid, first, end, [&](int l) { return lines + static_cast<std::int64_t>(l - first) * pitch; });
}

int write_quicklook_geotiff(const std::string& outPath, int lines, int samples, const ComplexRowSource& source,
                            const QuickLookRequest& request, QuickLookResult* result) {
  QuickLookGrid grid;
  if (int st = grid.start(lines, samples, request)) return st;
  // The lines are read in order, a batch at a time.
  constexpr int kBatch = 256;
  std::vector<std::complex<float>> batch(static_cast<std::size_t>(kBatch) * samples);
  for (int b0 = 0; b0 < lines; b0 += kBatch) {
    const int b1 = std::min(lines, b0 + kBatch);
    for (int l = b0; l < b1; ++l)
      if (!source(l, std::span<std::complex<float>>(batch.data() + static_cast<std::ptrdiff_t>(l - b0) * samples,
                                                    static_cast<std::size_t>(samples))))
        return 10;
    add_lines(grid, b0, b1, [&](int l) { return batch.data() + static_cast<std::ptrdiff_t>(l - b0) * samples; });
  }
  return write_quicklook_grid(outPath, grid, request, result);
}

int write_quicklook_grid(const std::string& outPath, const QuickLookGrid& grid, const QuickLookRequest& request,
                         QuickLookResult* result) {
  const int width = grid.width, height = grid.height;
  const std::vector<double>& power = grid.power;
  const std::vector<uint32_t>& counts = grid.counts;
  if (width <= 0 || height <= 0 || power.size() != static_cast<std::size_t>(width) * height) return 10;
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

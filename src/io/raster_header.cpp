#include "io/raster_header.hpp"

#include <algorithm>
#include <cstdio>
#include <memory>
#include <string_view>
#include <vector>

#include "base/profile.hpp"
#include "io/cell_types.hpp"
#include "io/data_file.hpp"

namespace sar::io {

int add_raster_elements(metadata::GeneralSAR_BaseXML& header, int32_t& lines, int32_t& pixels,
                        int64_t& headerOffset, int32_t& rowPrefix, int32_t& byteOrder, int32_t& cellType) {
  constexpr double kIntMax = 2147483647.0;
  constexpr double kInt64Max = 9.2233720368547758e18;
  header.createElementsVector(6);
  int st = 0;
  st |= header.addElementInt("NrOfLinesPerImage", &lines, 1, 0.0, kIntMax, true);
  st |= header.addElementInt("NrOfPixelsPerLine", &pixels, 1, 0.0, kIntMax, true);
  st |= header.addElementInt64("HeaderOffset", &headerOffset, 1, 0.0, kInt64Max, true);
  st |= header.addElementInt("RowPrefix", &rowPrefix, 1, 0.0, kIntMax, true);
  st |= header.addElementInt("ByteOrder", &byteOrder, 1, 0.0, 1.0, true);
  st |= header.addElementInt("CellType", &cellType, 1, 0.0, 9.0, true);
  return st;
}


namespace {

struct FileCloser {
  void operator()(std::FILE* f) const { std::fclose(f); }
};
using FilePtr = std::unique_ptr<std::FILE, FileCloser>;

}  // namespace

int64_t raster_bytes_of(const RasterHeader& h) {
  const int size = cell_size(h.cellType);
  if (size == 0 || h.lines < 0 || h.pixels < 0 || h.rowPrefix < 0 || h.headerOffset < 0) return -1;
  const int64_t pitch = static_cast<int64_t>(h.pixels) * size + h.rowPrefix;
  int64_t total = 0;
  if (__builtin_mul_overflow(pitch, static_cast<int64_t>(h.lines), &total) ||
      __builtin_add_overflow(total, h.headerOffset, &total)) {
    return -1;
  }
  return total;
}

int read_raster_header_profile(const std::string& hdr, RasterHeader& h) {
  using namespace sar::base;
  const std::string_view s = kRasterInfoSection;
  int32_t lines = 0;
  int32_t pixels = 0;
  int32_t prefix = 0;
  int64_t offset = 0;
  std::string order;
  std::string type;
  if (GetParInt(hdr, "NrOfLinesPerImage", {&lines, 1}, s) != kProfileOk ||
      GetParInt(hdr, "NrOfPixelsPerLine", {&pixels, 1}, s) != kProfileOk ||
      GetMyProfileInt64Array(s, "HeaderOffset", {&offset, 1}, hdr) != kProfileOk ||
      GetParInt(hdr, "RowPrefix", {&prefix, 1}, s) != kProfileOk ||
      GetParString(hdr, "ByteOrder", 1, order, 512, s) != kProfileOk ||
      GetParString(hdr, "CellType", 1, type, 512, s) != kProfileOk) {
    return 1;
  }
  h.lines = lines;
  h.pixels = pixels;
  h.headerOffset = offset;
  h.rowPrefix = prefix;
  h.byteOrder = byte_order_from_name(order);
  h.cellType = cell_type_from_name(type);
  return h.cellType < 0 ? 1 : 0;
}

int write_raster_header_profile(const std::string& hdr, const RasterHeader& h) {
  using namespace sar::base;
  const std::string_view s = kRasterInfoSection;
  const std::string_view type = cell_type_name(h.cellType);
  if (type.empty() || raster_bytes_of(h) < 0) return 1;
  if (WriteMyProfileInt(s, "NrOfLinesPerImage", h.lines, hdr) != kProfileOk ||
      WriteMyProfileInt(s, "NrOfPixelsPerLine", h.pixels, hdr) != kProfileOk ||
      WriteMyProfileInt64(s, "HeaderOffset", h.headerOffset, hdr) != kProfileOk ||
      WriteMyProfileInt(s, "RowPrefix", h.rowPrefix, hdr) != kProfileOk ||
      WriteMyProfileString(s, "ByteOrder", byte_order_name(h.byteOrder), hdr) != kProfileOk ||
      WriteMyProfileString(s, "CellType", type, hdr) != kProfileOk) {
    return 1;
  }
  return SyncProfile(hdr) == 0 ? 0 : 1;
}

int copy_raster_bytes(const std::string& from, const std::string& to, int64_t total, int64_t chunkBytes) {
  if (chunkBytes <= 0 || total < 0 || from.empty() || to.empty() || from == to) return 1;
  FilePtr in(std::fopen(from.c_str(), "rb"));
  if (!in) return 1;
  FilePtr out(std::fopen(to.c_str(), "wb"));
  if (!out) return 1;
  std::vector<unsigned char> chunk(static_cast<size_t>(std::max<int64_t>(1, std::min(chunkBytes, total))));
  for (int64_t done = 0; done < total;) {
    const auto n = static_cast<size_t>(std::min<int64_t>(static_cast<int64_t>(chunk.size()), total - done));
    // A source shorter than its description is an error, not a shorter copy.
    if (std::fread(chunk.data(), 1, n, in.get()) != n) return 1;
    if (std::fwrite(chunk.data(), 1, n, out.get()) != n) return 1;
    done += static_cast<int64_t>(n);
  }
  return std::fclose(out.release()) == 0 ? 0 : 1;
}

}  // namespace sar::io

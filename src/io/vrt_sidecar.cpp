#include "io/vrt_sidecar.hpp"

#include <cstdio>
#include <filesystem>
#include <fstream>
#include <system_error>

#include "io/cell_types.hpp"

namespace sar::io {

namespace {

std::string xml_escape(std::string_view text) {
  std::string out;
  out.reserve(text.size());
  for (char c : text) {
    switch (c) {
      case '&': out += "&amp;"; break;
      case '<': out += "&lt;"; break;
      case '>': out += "&gt;"; break;
      case '"': out += "&quot;"; break;
      case '\'': out += "&apos;"; break;
      default: out += c;
    }
  }
  return out;
}

std::string band_text(int band, std::string_view dataType, const std::string& source, int64_t imageOffset,
                      int pixelOffset, int64_t lineOffset, std::string_view byteOrder, std::string_view description,
                      bool signedByte) {
  char numbers[256];
  std::string out;
  out += "  <VRTRasterBand dataType=\"" + std::string(dataType) + "\" band=\"" + std::to_string(band) +
         "\" subClass=\"VRTRawRasterBand\">\n";
  if (!description.empty()) out += "    <Description>" + std::string(description) + "</Description>\n";
  if (signedByte) {
    out += "    <Metadata domain=\"IMAGE_STRUCTURE\">\n      <MDI key=\"PIXELTYPE\">SIGNEDBYTE</MDI>\n"
           "    </Metadata>\n";
  }
  out += "    <SourceFilename relativeToVRT=\"1\">" + xml_escape(source) + "</SourceFilename>\n";
  std::snprintf(numbers, sizeof numbers,
                "    <ImageOffset>%lld</ImageOffset>\n    <PixelOffset>%d</PixelOffset>\n"
                "    <LineOffset>%lld</LineOffset>\n",
                static_cast<long long>(imageOffset), pixelOffset, static_cast<long long>(lineOffset));
  out += numbers;
  out += "    <ByteOrder>" + std::string(byteOrder) + "</ByteOrder>\n";
  out += "  </VRTRasterBand>\n";
  return out;
}

}  // namespace

std::string_view gdal_data_type(int32_t cellType) {
  switch (cellType) {
    case kFloatComplex: return "CFloat32";
    case kFloat32: return "Float32";
    case kDoubleComplex: return "CFloat64";
    case kFloat64: return "Float64";
    case kIntComplex: return "CInt32";
    case kInt32: return "Int32";
    case kShortComplex: return "CInt16";
    case kInt16: return "Int16";
    case kInt8Complex:
    case kInt8: return "Byte";
    default: return "";
  }
}

std::string vrt_sidecar_path(const std::string& rasterPath) { return rasterPath + ".vrt"; }

std::string vrt_sidecar_text(const RasterLayout& layout) {
  const int size = cell_size(layout.cellType);
  if (size == 0 || layout.pixels < 0 || layout.lines < 0 || layout.rowPrefix < 0 || layout.headerOffset < 0 ||
      layout.path.empty()) {
    return {};
  }
  int64_t lineOffset = 0;
  int64_t imageOffset = 0;
  if (__builtin_mul_overflow(static_cast<int64_t>(layout.pixels), static_cast<int64_t>(size), &lineOffset) ||
      __builtin_add_overflow(lineOffset, static_cast<int64_t>(layout.rowPrefix), &lineOffset) ||
      __builtin_add_overflow(layout.headerOffset, static_cast<int64_t>(layout.rowPrefix), &imageOffset)) {
    return {};
  }
  const std::string source = std::filesystem::path(layout.path).filename().string();
  const std::string_view order = layout.byteOrder == kBigEndian ? "MSB" : "LSB";
  std::string out = "<VRTDataset rasterXSize=\"" + std::to_string(layout.pixels) + "\" rasterYSize=\"" +
                    std::to_string(layout.lines) + "\">\n";
  if (layout.cellType == kInt8Complex) {
    out += band_text(1, "Byte", source, imageOffset, size, lineOffset, order, "I", true);
    out += band_text(2, "Byte", source, imageOffset + 1, size, lineOffset, order, "Q", true);
  } else {
    out += band_text(1, gdal_data_type(layout.cellType), source, imageOffset, size, lineOffset, order, "",
                     layout.cellType == kInt8);
  }
  out += "</VRTDataset>\n";
  return out;
}

int write_vrt_sidecar(const RasterLayout& layout) {
  const std::string text = vrt_sidecar_text(layout);
  if (text.empty()) return 1;
  const std::string path = vrt_sidecar_path(layout.path);
  const std::string tmp = path + ".tmp~";
  {
    std::ofstream out(tmp, std::ios::binary | std::ios::trunc);
    if (!out) return 1;
    out << text;
    if (!out.flush()) {
      out.close();
      std::error_code ec;
      std::filesystem::remove(tmp, ec);
      return 1;
    }
  }
  std::error_code ec;
  std::filesystem::rename(tmp, path, ec);
  if (ec) {
    std::filesystem::remove(tmp, ec);
    return 1;
  }
  return 0;
}

}  // namespace sar::io

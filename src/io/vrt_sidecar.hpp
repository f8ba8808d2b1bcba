#pragma once
// GDAL VRT description of a raw raster, so that gdalinfo, QGIS and Python open the engine's
// rasters directly: one VRTRawRasterBand per band, pointing at the raster beside it.
//
//   ImageOffset = headerOffset + rowPrefix    (the first cell of line 0)
//   PixelOffset = cell size
//   LineOffset  = pixels * cell size + rowPrefix
//
// Types: FLOAT_COMPLEX CFloat32, FLOAT32 Float32, DOUBLE_COMPLEX CFloat64, FLOAT64 Float64,
// code 4 CInt32, INT32 Int32, SHORT_COMPLEX CInt16, INT16 Int16. GDAL has no complex 8-bit type
// and, before 3.7, no signed 8-bit type: INT8 is a Byte band marked PIXELTYPE=SIGNEDBYTE, and
// INT8_COMPLEX two such bands (I, Q).
#include <cstdint>
#include <string>
#include <string_view>

namespace sar::io {

struct RasterLayout {
  std::string path;  // the raster itself
  int32_t pixels = 0;
  int32_t lines = 0;
  int32_t rowPrefix = 0;
  int64_t headerOffset = 0;
  int32_t cellType = 0;
  int32_t byteOrder = 0;
};

/// GDAL data type name of a cell type ("" for codes without one).
std::string_view gdal_data_type(int32_t cellType);
/// The VRT document text; empty when the layout is impossible.
std::string vrt_sidecar_text(const RasterLayout& layout);
/// Path of the sidecar: the raster path + ".vrt".
std::string vrt_sidecar_path(const std::string& rasterPath);
/// Writes the sidecar (through a temporary file); 0 or 1.
int write_vrt_sidecar(const RasterLayout& layout);

}  // namespace sar::io

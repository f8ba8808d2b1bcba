#pragma once
// The "RasterInfo" description shared by DataFile and BufferFile, in its older profile text
// form (type and byte order by name), and a bounded raw copy of a raster.
#include <cstdint>
#include <string>

#include "metadata/base_xml.hpp"

namespace sar::io {

struct RasterHeader {
  int32_t lines = 0;
  int32_t pixels = 0;
  int64_t headerOffset = 0;
  int32_t rowPrefix = 0;
  int32_t byteOrder = 0;
  int32_t cellType = 0;
};

/// Registers the six "RasterInfo" keys, bound to the given fields, as the elements of a raster
/// description's header object. One list for every raster kind, so their headers agree.
int add_raster_elements(metadata::GeneralSAR_BaseXML& header, int32_t& lines, int32_t& pixels,
                        int64_t& headerOffset, int32_t& rowPrefix, int32_t& byteOrder, int32_t& cellType);

/// Bytes of the raster the header describes; -1 for negative sizes, an unknown type or a total
/// beyond 64 bits.
int64_t raster_bytes_of(const RasterHeader& h);

/// Reads the six keys of section "RasterInfo" from a profile text header. 1 for a missing key or
/// an unknown cell type name (then cellType is -1).
int read_raster_header_profile(const std::string& hdr, RasterHeader& h);
/// Writes them and syncs the file; 1 for a type without a name (code 4) or a failed write.
int write_raster_header_profile(const std::string& hdr, const RasterHeader& h);

/// Copies the first `total` bytes of `from` to `to` in chunks of `chunkBytes`; 1 when the source
/// is shorter or a stream fails.
int copy_raster_bytes(const std::string& from, const std::string& to, int64_t total, int64_t chunkBytes);

}  // namespace sar::io

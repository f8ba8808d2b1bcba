#pragma once
// Rasters on disk and rectangular windows on them.
//
// File layout: headerOffset bytes of header, then `lines` lines, each of rowPrefix bytes of
// prefix followed by `pixels` cells of one cell type, in one byte order. Line l starts at
//     headerOffset + l * (pixels * cell size + rowPrefix)
// computed in 64 bits. The description lives beside the raster in <raster>.hdr, section
// "RasterInfo" (XML header document, or the older profile text with type and order by name);
// writing it also leaves a GDAL VRT description <raster>.vrt for outside tools.
//
// A DataFile optionally keeps a user-space buffer (bufferSize > 0 before open) so that narrow
// column windows of wide rasters move no file position for the small seeks between lines.
// BufferIO reads and writes a window in the cell type of the caller's memory, converting and
// swapping as needed.
//
// Every operation returns 0 for success and 1 (or a stream failure code) otherwise; failures of
// stream steps leave a "Called function returned ERROR" report at level 3. Not thread-safe.
#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <memory>
#include <span>
#include <string>
#include <vector>

#include "io/cell_types.hpp"
#include "metadata/base_xml.hpp"

namespace sar::io {

/// Section of raster headers.
inline constexpr const char* kRasterInfoSection = "RasterInfo";

/// Access of an open DataFile.
enum DataFileAccess : int32_t { kAccessRead = 0, kAccessWrite = 1, kAccessReadWrite = 2 };

class DataFile : public sar::metadata::GeneralSAR_BaseXML {
 public:
  DataFile();
  explicit DataFile(std::string name);
  ~DataFile() override;
  DataFile(const DataFile&) = delete;
  DataFile& operator=(const DataFile&) = delete;

  // Description of the raster. Set them (or read_hdr / clone) before opening.
  std::string fileName;
  int32_t pixels = 0;          // NrOfPixelsPerLine
  int32_t lines = 0;           // NrOfLinesPerImage
  int32_t rowPrefix = 0;       // bytes before each line
  int64_t headerOffset = 0;    // bytes before the first line
  int32_t cellType = kFloatComplex;
  int32_t byteOrder = kLittleEndian;  // from raster_settings() at construction
  int32_t bufferSize = 0;      // 0: unbuffered

  /// Binds NrOfLinesPerImage, NrOfPixelsPerLine, HeaderOffset, RowPrefix, ByteOrder, CellType.
  int refreshParameters() override;

  /// Modes: 0 "rb" (read), 1 "wb" (write, truncating), 2 "r+b" (write into an existing file),
  /// 3 "rb+" (read and write). Any other mode only resets the buffer state and gives 1.
  int open(int mode);
  /// Flushes, extends a written raster to the end of the last line it reached, and closes.
  int close();
  /// Origin 0 from the start of the file, 1 from the current position.
  int seek(int64_t offset, int origin);
  /// A short read at the end of the file is no error; last_count() tells what arrived.
  int read(void* buffer, int64_t bytes);
  int write(const void* buffer, int64_t bytes);
  int64_t tell() const;
  int64_t last_count() const { return lastCount_; }

  /// Reads <path>.hdr: XML first, then profile text. 1 for a missing header, a missing key, an
  /// unknown cell type name (the cell type becomes -1) or impossible sizes.
  int read_hdr(const std::string& path);
  /// Writes <fileName>.hdr in the dialect of the header already there (new headers are XML), and
  /// the VRT sidecar <fileName>.vrt.
  int write_hdr();
  /// Writes <fileName>.hdr as profile text with names for the type and the byte order (refused
  /// for an XML header and for cell type 4, which has no name), and the VRT sidecar.
  int write_hdr_profile();
  /// Copies the description (not the stream or the buffer state) of `other`.
  int clone(const DataFile& other);
  /// Copies headerOffset + lines * line pitch bytes of the raster to `path` in chunks.
  int copy(const std::string& path, int64_t chunkBytes);

  int element_sizeof() const { return cell_size(cellType); }
  bool exists() const;
  bool is_open() const { return stream_ != nullptr; }
  bool is_buffered() const { return !buffer_.empty(); }
  bool is_writing() const { return is_open() && access_ != kAccessRead; }
  bool is_complex() const { return cell_is_complex(cellType); }
  int32_t access() const { return access_; }
  std::string hdrName() const { return fileName + ".hdr"; }

  /// Bytes of one line including its prefix; -1 for an unknown cell type or negative sizes.
  int64_t line_pitch() const;
  /// File position of a line's prefix; -1 when it does not fit in 64 bits.
  int64_t line_offset(int64_t line) const;
  /// Bytes of the whole raster as the description says; -1 when impossible.
  int64_t raster_bytes() const;

 private:
  struct FileCloser {
    void operator()(std::FILE* f) const { std::fclose(f); }
  };

  int flush();
  int fill(int64_t position);
  int stream_seek(int64_t position);
  int64_t stream_read(void* buffer, int64_t bytes, int64_t position);
  int64_t stream_write(const void* buffer, int64_t bytes, int64_t position);
  void note_extent(int64_t end) {
    if (end > extent_) extent_ = end;
  }
  friend class BufferIO;

  std::unique_ptr<std::FILE, FileCloser> stream_;
  int32_t access_ = kAccessRead;
  std::vector<unsigned char> buffer_;
  int64_t bufferPosition_ = 0;  // file position of buffer_[0], or the file position unbuffered
  int32_t positionInBuffer_ = 0;
  int32_t bytesInBuffer_ = 0;
  int64_t streamPosition_ = -1;  // where the stream stands, -1 when unknown
  bool lastWasWrite_ = false;
  int64_t extent_ = 0;  // furthest position a writer reached, written or sought over
  int64_t lastCount_ = 0;
};

/// A window of a raster, read and written in the caller's cell type `memType` (0..7).
class BufferIO {
 public:
  BufferIO() = default;
  BufferIO(DataFile* file, int32_t firstColumn, int32_t columns, int32_t firstLine, int32_t lines, int32_t memType)
      : df(file), firstColumn(firstColumn), columns(columns), firstLine(firstLine), lines(lines), memType(memType) {}

  DataFile* df = nullptr;
  int32_t firstColumn = 0;
  int32_t columns = 0;
  int32_t firstLine = 0;
  int32_t lines = 0;
  int32_t memType = kFloatComplex;

  /// lines * rowPrefix bytes.
  int readprefix(void* buffer);
  int writeprefix(const void* buffer);
  /// lines rows of `columns` cells, one after another (or `strideCells` cells apart).
  int readbuffer(void* buffer);
  int readbuffer(void* buffer, int64_t strideCells);
  int writebuffer(const void* buffer);
  int writebuffer(const void* buffer, int64_t strideCells);

  /// Bounds-checked forms: the span must hold the whole window.
  int readbuffer(std::span<std::byte> buffer, int64_t strideCells);
  int writebuffer(std::span<const std::byte> buffer, int64_t strideCells);
  /// Bytes of caller memory that a window with this stride covers; -1 when impossible.
  int64_t memory_bytes(int64_t strideCells) const;

 private:
  int check(bool writing) const;
};

}  // namespace sar::io

#pragma once
// A raster or record stream with a user-space read-ahead and write-behind buffer, for long
// line-by-line runs over large files in bounded memory.
//
// Reading keeps a tail of already-read data at every refill (the keep-back), so the small
// backward seeks of line-aligned readers are served from memory. Writing collects bytes in the
// buffer and writes them out when it is full, at a seek outside it, and at close. Without
// initbuffer() every call goes straight to the stream.
//
// The description is the same "RasterInfo" header as DataFile's; writing it also leaves the GDAL
// VRT sidecar. Not thread-safe.
#include <cstdint>
#include <cstdio>
#include <memory>
#include <string>
#include <vector>

#include "io/cell_types.hpp"
#include "metadata/base_xml.hpp"

namespace sar::io {

class BufferFile : public sar::metadata::GeneralSAR_BaseXML {
 public:
  enum OperationType : int32_t { kOpNone = 0, kOpRead = 1, kOpWrite = 2, kOpReadWrite = 3 };
  enum SeekType : int32_t { kSeekSet = 0, kSeekCur = 1, kSeekEnd = 2 };

  BufferFile();
  explicit BufferFile(std::string name);
  ~BufferFile() override;
  BufferFile(const BufferFile&) = delete;
  BufferFile& operator=(const BufferFile&) = delete;

  int refreshParameters() override;

  void setFilename(std::string name) { fileName_ = std::move(name); }
  const std::string& getFilename() const { return fileName_; }
  void setSamples(int32_t samples) { samples_ = samples; }
  void setLines(int32_t lines) { lines_ = lines; }
  void setRowPrefix(int32_t bytes) { rowPrefix_ = bytes; }
  void setOffsetSize(int64_t bytes) { headerOffset_ = bytes; }
  void setType(int32_t type) { cellType_ = type; }
  void setFileEndian(int32_t order) { byteOrder_ = order; }
  int32_t getSamples() const { return samples_; }
  int32_t getLines() const { return lines_; }
  int32_t getRowPrefix() const { return rowPrefix_; }
  int64_t getOffsetSize() const { return headerOffset_; }
  int32_t getType() const { return cellType_; }
  int32_t getFileEndian() const { return byteOrder_; }
  OperationType getOpType() const { return op_; }

  /// Header <name>.hdr (XML first, then profile text); the name becomes the file name.
  int readhdr(const std::string& name) override;
  int readhdr();
  /// Header of this description at <name>.hdr (in the dialect of a header already there, new
  /// ones XML) and the VRT sidecar <name>.vrt.
  int writehdr() override;
  int writehdr(const std::string& name) override;

  /// 1 read ("rb"), 2 write ("w+b"), 3 read and write ("r+b").
  int open(OperationType op);
  /// Flushes, completes a written raster to the end of the last line reached, closes.
  int close();
  /// 0 or 1 (a negative target or a failed stream).
  int seek(int64_t offset, SeekType origin);
  int64_t tell() const;
  /// Bytes moved: less than asked at the end of the file, 0 in the wrong direction.
  int64_t read(void* buffer, int64_t bytes);
  int64_t write(const void* buffer, int64_t bytes);
  /// size > 0 gives a buffer of `size` bytes keeping up to `keepback` bytes behind each refill;
  /// size <= 0 returns to unbuffered access.
  int initbuffer(int64_t size, int64_t keepback);

  bool is_open() const { return stream_ != nullptr; }
  bool is_buffered() const { return !buffer_.empty(); }
  bool is_writing() const { return is_open() && (op_ == kOpWrite || op_ == kOpReadWrite); }
  bool is_complex() const { return cell_is_complex(cellType_); }
  bool exists() const;
  /// Cell size of the type, 0 while the type is unset (10).
  int pixelsizeof() const { return cell_size(cellType_); }
  int clone(const BufferFile& other);
  int copy(const std::string& path, int64_t chunkBytes);
  /// Writes `bytes` header bytes at the start of the file, keeps the position, and makes their
  /// count the header offset.
  int writeOffset(const void* header, int32_t bytes);

  /// Windows of `lines` lines from `firstLine` and `columns` cells from `firstColumn` (0 columns:
  /// the rest of the line), converted from the file's type and order to the caller's. 0 or 1.
  template <class T>
  int readbuffer(T* buffer, int64_t firstLine, int32_t lines, int32_t firstColumn, int32_t columns) {
    return read_window(buffer, cell_type_of<T>(), firstLine, lines, firstColumn, columns);
  }
  template <class T>
  int writebuffer(const T* buffer, int64_t firstLine, int32_t lines, int32_t firstColumn, int32_t columns) {
    return write_window(buffer, cell_type_of<T>(), firstLine, lines, firstColumn, columns);
  }
  int readprefix(void* buffer, int64_t firstLine, int32_t lines);
  int writeprefix(const void* buffer, int64_t firstLine, int32_t lines);

  /// One cell; 0 when it cannot be read.
  float readFloat(int64_t line, int32_t column);
  double readDouble(int64_t line, int32_t column);
  int32_t readInt(int64_t line, int32_t column);
  int16_t readShort(int64_t line, int32_t column);
  fcomplex readFloatComplex(int64_t line, int32_t column);
  dcomplex readDoubleComplex(int64_t line, int32_t column);

  /// Bytes of a line including its prefix; -1 while the type is unset or sizes are negative.
  int64_t line_pitch() const;
  int64_t line_offset(int64_t line) const;

 private:
  struct FileCloser {
    void operator()(std::FILE* f) const { std::fclose(f); }
  };

  int read_window(void* buffer, int32_t memType, int64_t firstLine, int32_t lines, int32_t firstColumn,
                  int32_t columns);
  int write_window(const void* buffer, int32_t memType, int64_t firstLine, int32_t lines, int32_t firstColumn,
                   int32_t columns);
  int check_window(int32_t memType, int64_t firstLine, int32_t lines, int32_t firstColumn, int32_t& columns,
                   bool writing) const;
  int flush(bool empty);
  int refill();
  int fill_at(int64_t start);
  int64_t stream_read(void* buffer, int64_t bytes, int64_t position);
  int64_t stream_write(const void* buffer, int64_t bytes, int64_t position);
  int64_t file_size();

  std::string fileName_;
  int32_t lines_ = 0;
  int32_t samples_ = 0;
  int32_t rowPrefix_ = 0;
  int64_t headerOffset_ = 0;
  std::unique_ptr<std::FILE, FileCloser> stream_;
  int32_t cellType_ = kCellUnset;
  int32_t byteOrder_ = kLittleEndian;
  OperationType op_ = kOpNone;
  int64_t position_ = 0;  // file position when unbuffered
  std::vector<unsigned char> buffer_;
  int64_t keepBack_ = 0;
  int64_t positionInBuffer_ = 0;
  int64_t validBytes_ = 0;
  int64_t bufferStart_ = 0;  // file position of buffer_[0]; its end is bufferStart_ + validBytes_
  bool dirty_ = false;
  int64_t streamPosition_ = -1;
  bool lastWasWrite_ = false;
  int64_t extent_ = 0;
};

}  // namespace sar::io

#include "io/data_file.hpp"

#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cstring>
#include <filesystem>
#include <limits>
#include "base/source_location.hpp"
#include <system_error>

#include "base/diagnostics.hpp"
#include "io/raster_header.hpp"
#include "io/vrt_sidecar.hpp"

namespace sar::io {

namespace {


// A failing stream step leaves the call-tree report and gives 1.
int failed(base::source_location loc = base::source_location::current()) {
  sar::base::report(sar::base::kReportErrorCallTree, sar::base::kCalledFunctionError, loc);
  return 1;
}

bool add_ok(int64_t a, int64_t b, int64_t& out) { return !__builtin_add_overflow(a, b, &out); }
bool mul_ok(int64_t a, int64_t b, int64_t& out) { return !__builtin_mul_overflow(a, b, &out); }

}  // namespace

DataFile::DataFile() : byteOrder(raster_settings().byte_order) {}

DataFile::DataFile(std::string name) : DataFile() { fileName = std::move(name); }

DataFile::~DataFile() { close(); }

int DataFile::refreshParameters() { return add_raster_elements(*this, lines, pixels, headerOffset, rowPrefix, byteOrder, cellType); }

// ------------------------------------------------------------------------------ geometry

int64_t DataFile::line_pitch() const { return raster_line_pitch(pixels, cellType, rowPrefix); }

int64_t DataFile::line_offset(int64_t line) const { return raster_line_offset(line, line_pitch(), headerOffset); }

int64_t DataFile::raster_bytes() const { return lines < 0 ? -1 : line_offset(lines); }

bool DataFile::exists() const {
  std::error_code ec;
  return !fileName.empty() && std::filesystem::is_regular_file(fileName, ec);
}

// ------------------------------------------------------------------------------ stream steps

int DataFile::stream_seek(int64_t position) {
  if (position < 0) return 1;
  if (fseeko(stream_.get(), static_cast<off_t>(position), SEEK_SET) != 0) {
    streamPosition_ = -1;
    return 1;
  }
  streamPosition_ = position;
  return 0;
}

int64_t DataFile::stream_read(void* buffer, int64_t bytes, int64_t position) {
  // The C library wants a positioning call between a write and a following read.
  if (lastWasWrite_ || streamPosition_ != position) {
    if (stream_seek(position) != 0) return -1;
  }
  lastWasWrite_ = false;
  const size_t got = std::fread(buffer, 1, static_cast<size_t>(bytes), stream_.get());
  if (got < static_cast<size_t>(bytes) && std::ferror(stream_.get())) {
    std::clearerr(stream_.get());
    streamPosition_ = -1;
    return -1;
  }
  streamPosition_ = position + static_cast<int64_t>(got);
  return static_cast<int64_t>(got);
}

int64_t DataFile::stream_write(const void* buffer, int64_t bytes, int64_t position) {
  if (!lastWasWrite_ || streamPosition_ != position) {
    if (stream_seek(position) != 0) return -1;
  }
  lastWasWrite_ = true;
  const size_t put = std::fwrite(buffer, 1, static_cast<size_t>(bytes), stream_.get());
  streamPosition_ = position + static_cast<int64_t>(put);
  note_extent(streamPosition_);
  if (put < static_cast<size_t>(bytes)) {
    std::clearerr(stream_.get());
    streamPosition_ = -1;
    return -1;
  }
  return static_cast<int64_t>(put);
}

int DataFile::fill(int64_t position) {
  const int64_t got = stream_read(buffer_.data(), static_cast<int64_t>(buffer_.size()), position);
  bufferPosition_ = position;
  positionInBuffer_ = 0;
  bytesInBuffer_ = 0;
  if (got < 0) return 1;
  bytesInBuffer_ = static_cast<int32_t>(got);
  return 0;
}

int DataFile::flush() {
  if (!is_open() || buffer_.empty() || access_ != kAccessWrite) return 0;
  const int64_t logical = bufferPosition_ + positionInBuffer_;
  if (bytesInBuffer_ > 0 && stream_write(buffer_.data(), bytesInBuffer_, bufferPosition_) != bytesInBuffer_) {
    return 1;
  }
  bufferPosition_ = logical;
  positionInBuffer_ = 0;
  bytesInBuffer_ = 0;
  return 0;
}

// ------------------------------------------------------------------------------ open / close

int DataFile::open(int mode) {
  if (is_open()) close();
  bufferPosition_ = 0;
  positionInBuffer_ = 0;
  bytesInBuffer_ = 0;
  streamPosition_ = 0;
  lastWasWrite_ = false;
  extent_ = 0;
  lastCount_ = 0;
  buffer_.clear();
  const char* how = nullptr;
  switch (mode) {
    case 0: how = "rb"; access_ = kAccessRead; break;
    case 1: how = "wb"; access_ = kAccessWrite; break;
    case 2: how = "r+b"; access_ = kAccessWrite; break;
    case 3: how = "rb+"; access_ = kAccessReadWrite; break;
    default: return 1;
  }
  if (fileName.empty()) return failed();
  stream_.reset(std::fopen(fileName.c_str(), how));
  if (!stream_) return failed();
  if (bufferSize > 0) {
    buffer_.assign(static_cast<size_t>(bufferSize), 0);
    // Our own buffer does the work; a second one in the C library would only copy twice.
    std::setvbuf(stream_.get(), nullptr, _IONBF, 0);
  }
  return 0;
}

int DataFile::close() {
  if (!is_open()) {
    buffer_.clear();
    return 0;
  }
  int status = flush();
  if (access_ != kAccessRead && extent_ > 0) {
    // A writer that sought over the end of its last line still leaves a complete raster.
    std::fflush(stream_.get());
    struct stat st {};
    const int fd = fileno(stream_.get());
    if (fstat(fd, &st) == 0 && st.st_size < extent_ && ftruncate(fd, static_cast<off_t>(extent_)) != 0) status = 1;
  }
  if (std::fclose(stream_.release()) != 0) status = 1;
  buffer_.clear();
  bufferPosition_ = 0;
  positionInBuffer_ = 0;
  bytesInBuffer_ = 0;
  streamPosition_ = -1;
  return status == 0 ? 0 : failed();
}

// ------------------------------------------------------------------------------ seek / read / write

int64_t DataFile::tell() const { return bufferPosition_ + positionInBuffer_; }

int DataFile::seek(int64_t offset, int origin) {
  if (!is_open() || (origin != 0 && origin != 1)) return 1;
  int64_t target = 0;
  if (buffer_.empty()) {
    if (origin == 0) {
      target = offset;
    } else if (!add_ok(bufferPosition_, offset, target)) {
      return 1;
    }
    if (target < 0) return 1;
    bufferPosition_ = target;  // the stream follows at the next read or write
    return 0;
  }
  if (access_ == kAccessWrite) {
    if (origin == 1 && offset == 0) return 0;
    if (origin == 0) {
      target = offset;
    } else if (!add_ok(tell(), offset, target)) {
      return 1;
    }
    if (target < 0) return 1;
    if (flush() != 0) return failed();
    bufferPosition_ = target;
    positionInBuffer_ = 0;
    bytesInBuffer_ = 0;
    return 0;
  }
  if (origin == 0) {
    // The span is exclusive at both ends: a seek to the buffer's first byte refills.
    if (offset > bufferPosition_ && offset < bufferPosition_ + bytesInBuffer_) {
      positionInBuffer_ = static_cast<int32_t>(offset - bufferPosition_);
      return 0;
    }
    target = offset;
  } else {
    int64_t inBuffer = 0;
    if (!add_ok(positionInBuffer_, offset, inBuffer)) return 1;
    if (inBuffer >= 0 && inBuffer < bytesInBuffer_) {
      positionInBuffer_ = static_cast<int32_t>(inBuffer);
      return 0;
    }
    if (!add_ok(bufferPosition_, inBuffer, target)) return 1;
  }
  if (target < 0) return 1;
  return fill(target) == 0 ? 0 : failed();
}

int DataFile::read(void* buffer, int64_t bytes) {
  lastCount_ = 0;
  if (!is_open() || access_ == kAccessWrite || bytes < 0 || (buffer == nullptr && bytes > 0)) return 1;
  auto* out = static_cast<unsigned char*>(buffer);
  if (buffer_.empty()) {
    const int64_t got = stream_read(out, bytes, bufferPosition_);
    if (got < 0) return failed();
    bufferPosition_ += got;
    lastCount_ = got;
    return 0;
  }
  int64_t remaining = bytes;
  while (remaining > 0) {
    const int64_t avail = bytesInBuffer_ - positionInBuffer_;
    if (avail > 0) {
      const int64_t n = std::min(avail, remaining);
      std::memcpy(out, buffer_.data() + positionInBuffer_, static_cast<size_t>(n));
      positionInBuffer_ += static_cast<int32_t>(n);
      out += n;
      remaining -= n;
      lastCount_ += n;
      continue;
    }
    const int64_t position = tell();
    if (remaining >= static_cast<int64_t>(buffer_.size())) {
      // A request of a buffer or more goes straight to the caller's memory.
      const int64_t got = stream_read(out, remaining, position);
      if (got < 0) return failed();
      lastCount_ += got;
      bufferPosition_ = position + got;
      positionInBuffer_ = 0;
      bytesInBuffer_ = 0;
      break;
    }
    if (fill(position) != 0) return failed();
    if (bytesInBuffer_ == 0) break;  // end of file: a short read is no error
  }
  return 0;
}

int DataFile::write(const void* buffer, int64_t bytes) {
  lastCount_ = 0;
  if (!is_open() || access_ == kAccessRead || bytes < 0 || (buffer == nullptr && bytes > 0)) return 1;
  const auto* in = static_cast<const unsigned char*>(buffer);
  if (buffer_.empty()) {
    if (stream_write(in, bytes, bufferPosition_) != bytes) return failed();
    bufferPosition_ += bytes;
    lastCount_ = bytes;
    return 0;
  }
  if (access_ == kAccessReadWrite) {
    // Read and write: the buffer caches reads; writes go through and patch what it holds.
    const int64_t position = tell();
    if (stream_write(in, bytes, position) != bytes) return failed();
    const int64_t lo = std::max(position, bufferPosition_);
    const int64_t hi = std::min(position + bytes, bufferPosition_ + bytesInBuffer_);
    if (lo < hi) {
      std::memcpy(buffer_.data() + (lo - bufferPosition_), in + (lo - position), static_cast<size_t>(hi - lo));
    }
    const int64_t next = position + bytes;
    if (next >= bufferPosition_ && next <= bufferPosition_ + bytesInBuffer_) {
      positionInBuffer_ = static_cast<int32_t>(next - bufferPosition_);
    } else {
      bufferPosition_ = next;
      positionInBuffer_ = 0;
      bytesInBuffer_ = 0;
    }
    lastCount_ = bytes;
    return 0;
  }
  const auto capacity = static_cast<int64_t>(buffer_.size());
  int64_t remaining = bytes;
  while (remaining > 0) {
    if (positionInBuffer_ == 0 && remaining >= capacity) {
      if (stream_write(in, remaining, bufferPosition_) != remaining) return failed();
      bufferPosition_ += remaining;
      lastCount_ += remaining;
      break;
    }
    const int64_t n = std::min(capacity - positionInBuffer_, remaining);
    std::memcpy(buffer_.data() + positionInBuffer_, in, static_cast<size_t>(n));
    positionInBuffer_ += static_cast<int32_t>(n);
    bytesInBuffer_ = std::max(bytesInBuffer_, positionInBuffer_);
    in += n;
    remaining -= n;
    lastCount_ += n;
    if (positionInBuffer_ == capacity && flush() != 0) return failed();
  }
  return 0;
}

// ------------------------------------------------------------------------------ header

int DataFile::read_hdr(const std::string& path) {
  close();
  bufferSize = 0;
  fileName = path;
  const std::string hdr = hdrName();
  int status = 1;
  switch (sar::metadata::header_dialect(hdr)) {
    case sar::metadata::HeaderDialect::kXml:
      status = readAuxiliaryFile(hdr, 1, kRasterInfoSection);
      break;
    case sar::metadata::HeaderDialect::kProfile: {
      RasterHeader h;
      status = read_raster_header_profile(hdr, h);
      if (status == 0) {
        lines = h.lines;
        pixels = h.pixels;
        headerOffset = h.headerOffset;
        rowPrefix = h.rowPrefix;
        byteOrder = h.byteOrder;
        cellType = h.cellType;
      }
      break;
    }
    case sar::metadata::HeaderDialect::kMissing: {
      const std::string text = "File : " + hdr + " DOES NOT EXIST!";
      sar::base::report(sar::base::kReportWarning, text);
      break;
    }
    case sar::metadata::HeaderDialect::kOtherXml:
      break;
  }
  if (status == 0 && (lines < 0 || pixels < 0 || rowPrefix < 0 || headerOffset < 0 || raster_bytes() < 0)) status = 1;
  // A raster whose header could not be read must not be read by a window either.
  if (status != 0) cellType = -1;
  return status;
}

int DataFile::write_hdr() {
  if (fileName.empty() || raster_bytes() < 0 || (byteOrder != kLittleEndian && byteOrder != kBigEndian)) return 1;
  const std::string hdr = hdrName();
  const auto dialect = sar::metadata::header_dialect(hdr);
  if (dialect == sar::metadata::HeaderDialect::kProfile) return write_hdr_profile();
  if (writeAuxiliaryFile(hdr, 1, kRasterInfoSection) != 0) return failed();
  if (write_vrt_sidecar({fileName, pixels, lines, rowPrefix, headerOffset, cellType, byteOrder}) != 0) {
    sar::base::report(sar::base::kReportWarning, "Cannot write the VRT description " + vrt_sidecar_path(fileName));
  }
  return 0;
}

int DataFile::write_hdr_profile() {
  if (fileName.empty()) return 1;
  const std::string hdr = hdrName();
  const auto dialect = sar::metadata::header_dialect(hdr);
  if (dialect != sar::metadata::HeaderDialect::kProfile && dialect != sar::metadata::HeaderDialect::kMissing) return 1;
  if (write_raster_header_profile(hdr, {lines, pixels, headerOffset, rowPrefix, byteOrder, cellType}) != 0) {
    return failed();
  }
  if (write_vrt_sidecar({fileName, pixels, lines, rowPrefix, headerOffset, cellType, byteOrder}) != 0) {
    sar::base::report(sar::base::kReportWarning, "Cannot write the VRT description " + vrt_sidecar_path(fileName));
  }
  return 0;
}

int DataFile::clone(const DataFile& other) {
  if (&other == this) return 0;
  fileName = other.fileName;
  pixels = other.pixels;
  lines = other.lines;
  rowPrefix = other.rowPrefix;
  headerOffset = other.headerOffset;
  cellType = other.cellType;
  byteOrder = other.byteOrder;
  bufferSize = other.bufferSize;
  return 0;
}

int DataFile::copy(const std::string& path, int64_t chunkBytes) {
  if (is_open()) {
    if (flush() != 0) return failed();
    std::fflush(stream_.get());
  }
  return copy_raster_bytes(fileName, path, raster_bytes(), chunkBytes) == 0 ? 0 : failed();
}

// ------------------------------------------------------------------------------ BufferIO

int BufferIO::check(bool writing) const {
  if (df == nullptr) return 1;
  // Types outside 0..7 are refused without a message.
  if (memType < 0 || memType > 7 || df->cellType < 0 || df->cellType > 7) return 1;
  const bool bad_window = firstColumn < 0 || columns < 0 || firstLine < 0 || lines < 0 || df->pixels < 0 ||
                          df->rowPrefix < 0 ||
                          static_cast<int64_t>(firstColumn) + columns > static_cast<int64_t>(df->pixels) ||
                          (!writing && static_cast<int64_t>(firstLine) + lines > static_cast<int64_t>(df->lines)) ||
                          df->line_offset(static_cast<int64_t>(firstLine) + lines) < 0;
  if (bad_window) return failed();
  return 0;
}

int64_t BufferIO::memory_bytes(int64_t strideCells) const {
  if (lines <= 0 || columns <= 0) return 0;
  if (strideCells < columns) return -1;
  const int size = cell_size(memType);
  if (size == 0) return -1;
  int64_t out = 0;
  if (!mul_ok(static_cast<int64_t>(lines) - 1, strideCells, out) || !add_ok(out, columns, out) ||
      !mul_ok(out, size, out)) {
    return -1;
  }
  return out;
}

int BufferIO::readbuffer(void* buffer) { return readbuffer(buffer, columns); }

int BufferIO::readbuffer(std::span<std::byte> buffer, int64_t strideCells) {
  const int64_t need = memory_bytes(strideCells);
  if (need < 0 || static_cast<int64_t>(buffer.size()) < need) return 1;
  return readbuffer(buffer.data(), strideCells);
}

int BufferIO::readbuffer(void* buffer, int64_t strideCells) {
  if (const int st = check(false)) return st;
  if (strideCells < columns) return 1;
  if (columns == 0 || lines == 0) return 0;
  if (buffer == nullptr) return 1;
  DataFile& f = *df;
  if (!f.is_open() && f.open(0) != 0) return failed();
  if (f.access() == kAccessWrite) return 1;
  const int size = f.element_sizeof();
  const int memSize = cell_size(memType);
  const int64_t window = static_cast<int64_t>(columns) * size;
  const int64_t before = f.rowPrefix + static_cast<int64_t>(firstColumn) * size;
  const int64_t after = static_cast<int64_t>(f.pixels - firstColumn - columns) * size;
  const bool direct = memType == f.cellType;
  std::vector<unsigned char> line(direct ? 0 : static_cast<size_t>(window));
  auto* out = static_cast<unsigned char*>(buffer);

  if (f.seek(f.line_offset(firstLine) - f.tell(), 1) != 0) return failed();
  for (int32_t l = 0; l < lines; ++l) {
    unsigned char* dst = out + static_cast<int64_t>(l) * strideCells * memSize;
    unsigned char* raw = direct ? dst : line.data();
    if (f.seek(before, 1) != 0) return failed();
    if (f.read(raw, window) != 0) return failed();
    // A raster shorter than its header says.
    if (f.last_count() != window) return failed();
    if (f.seek(after, 1) != 0) return failed();
    cells_to_host(raw, f.cellType, static_cast<size_t>(columns), f.byteOrder);
    if (!direct) convert_cells(raw, f.cellType, dst, memType, static_cast<size_t>(columns));
  }
  return 0;
}

int BufferIO::writebuffer(const void* buffer) { return writebuffer(buffer, columns); }

int BufferIO::writebuffer(std::span<const std::byte> buffer, int64_t strideCells) {
  const int64_t need = memory_bytes(strideCells);
  if (need < 0 || static_cast<int64_t>(buffer.size()) < need) return 1;
  return writebuffer(buffer.data(), strideCells);
}

int BufferIO::writebuffer(const void* buffer, int64_t strideCells) {
  if (const int st = check(true)) return st;
  if (strideCells < columns) return 1;
  if (columns == 0 || lines == 0) return 0;
  if (buffer == nullptr) return 1;
  DataFile& f = *df;
  if (!f.is_open() && f.open(1) != 0) return failed();
  if (f.access() == kAccessRead) return 1;
  const int size = f.element_sizeof();
  const int memSize = cell_size(memType);
  const int64_t window = static_cast<int64_t>(columns) * size;
  const int64_t before = f.rowPrefix + static_cast<int64_t>(firstColumn) * size;
  const int64_t after = static_cast<int64_t>(f.pixels - firstColumn - columns) * size;
  std::vector<unsigned char> line(static_cast<size_t>(window));
  const auto* in = static_cast<const unsigned char*>(buffer);

  if (f.seek(f.line_offset(firstLine) - f.tell(), 1) != 0) return failed();
  for (int32_t l = 0; l < lines; ++l) {
    const unsigned char* src = in + static_cast<int64_t>(l) * strideCells * memSize;
    convert_cells(src, memType, line.data(), f.cellType, static_cast<size_t>(columns));
    cells_from_host(line.data(), f.cellType, static_cast<size_t>(columns), f.byteOrder);
    if (f.seek(before, 1) != 0) return failed();
    if (f.write(line.data(), window) != 0) return failed();
    if (f.seek(after, 1) != 0) return failed();
    f.note_extent(f.line_offset(static_cast<int64_t>(firstLine) + l + 1));
  }
  return 0;
}

int BufferIO::readprefix(void* buffer) {
  if (const int st = check(false)) return st;
  if (lines == 0 || df->rowPrefix == 0) return 0;
  if (buffer == nullptr) return 1;
  DataFile& f = *df;
  if (!f.is_open() && f.open(0) != 0) return failed();
  if (f.access() == kAccessWrite) return 1;
  const int64_t cells = static_cast<int64_t>(f.pixels) * f.element_sizeof();
  auto* out = static_cast<unsigned char*>(buffer);
  if (f.seek(f.line_offset(firstLine) - f.tell(), 1) != 0) return failed();
  for (int32_t l = 0; l < lines; ++l) {
    unsigned char* dst = out + static_cast<int64_t>(l) * f.rowPrefix;
    if (f.read(dst, f.rowPrefix) != 0 || f.last_count() != f.rowPrefix) return failed();
    prefix_swap(dst, static_cast<size_t>(f.rowPrefix), f.byteOrder);
    if (f.seek(cells, 1) != 0) return failed();
  }
  return 0;
}

int BufferIO::writeprefix(const void* buffer) {
  if (const int st = check(true)) return st;
  if (lines == 0 || df->rowPrefix == 0) return 0;
  if (buffer == nullptr) return 1;
  DataFile& f = *df;
  if (!f.is_open() && f.open(1) != 0) return failed();
  if (f.access() == kAccessRead) return 1;
  const int64_t cells = static_cast<int64_t>(f.pixels) * f.element_sizeof();
  const auto* in = static_cast<const unsigned char*>(buffer);
  std::vector<unsigned char> prefix(static_cast<size_t>(f.rowPrefix));
  if (f.seek(f.line_offset(firstLine) - f.tell(), 1) != 0) return failed();
  for (int32_t l = 0; l < lines; ++l) {
    std::memcpy(prefix.data(), in + static_cast<int64_t>(l) * f.rowPrefix, prefix.size());
    prefix_swap(prefix.data(), prefix.size(), f.byteOrder);
    if (f.write(prefix.data(), f.rowPrefix) != 0) return failed();
    if (f.seek(cells, 1) != 0) return failed();
    f.note_extent(f.line_offset(static_cast<int64_t>(firstLine) + l + 1));
  }
  return 0;
}

}  // namespace sar::io

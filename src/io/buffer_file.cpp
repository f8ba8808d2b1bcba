#include "io/buffer_file.hpp"

#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cstring>
#include <filesystem>
#include "base/source_location.hpp"
#include <system_error>

#include "base/diagnostics.hpp"
#include "io/data_file.hpp"
#include "io/raster_header.hpp"
#include "io/vrt_sidecar.hpp"

namespace sar::io {

namespace {


int failed(base::source_location loc = base::source_location::current()) {
  sar::base::report(sar::base::kReportErrorCallTree, sar::base::kCalledFunctionError, loc);
  return 1;
}

}  // namespace

BufferFile::BufferFile() : byteOrder_(raster_settings().byte_order) {}

BufferFile::BufferFile(std::string name) : BufferFile() { fileName_ = std::move(name); }

BufferFile::~BufferFile() { close(); }

int BufferFile::refreshParameters() { return add_raster_elements(*this, lines_, samples_, headerOffset_, rowPrefix_, byteOrder_, cellType_); }

int64_t BufferFile::line_pitch() const { return raster_line_pitch(samples_, cellType_, rowPrefix_); }

int64_t BufferFile::line_offset(int64_t line) const { return raster_line_offset(line, line_pitch(), headerOffset_); }

bool BufferFile::exists() const {
  std::error_code ec;
  return !fileName_.empty() && std::filesystem::is_regular_file(fileName_, ec);
}

// ------------------------------------------------------------------------------ header

int BufferFile::readhdr(const std::string& name) {
  fileName_ = name;
  return readhdr();
}

int BufferFile::readhdr() {
  const std::string hdr = fileName_ + ".hdr";
  int status = 1;
  switch (sar::metadata::header_dialect(hdr)) {
    case sar::metadata::HeaderDialect::kXml:
      status = readAuxiliaryFile(hdr, 1, kRasterInfoSection);
      break;
    case sar::metadata::HeaderDialect::kProfile: {
      RasterHeader h;
      status = read_raster_header_profile(hdr, h);
      if (status == 0) {
        lines_ = h.lines;
        samples_ = h.pixels;
        headerOffset_ = h.headerOffset;
        rowPrefix_ = h.rowPrefix;
        byteOrder_ = h.byteOrder;
        cellType_ = h.cellType;
      }
      break;
    }
    case sar::metadata::HeaderDialect::kMissing:
      sar::base::report(sar::base::kReportWarning, "File : " + hdr + " DOES NOT EXIST!");
      break;
    case sar::metadata::HeaderDialect::kOtherXml:
      break;
  }
  if (status == 0 && raster_bytes_of({lines_, samples_, headerOffset_, rowPrefix_, byteOrder_, cellType_}) < 0) {
    status = 1;
  }
  if (status != 0) cellType_ = kCellUnset;
  return status;
}

int BufferFile::writehdr() { return writehdr(fileName_); }

int BufferFile::writehdr(const std::string& name) {
  const RasterHeader h{lines_, samples_, headerOffset_, rowPrefix_, byteOrder_, cellType_};
  if (name.empty() || raster_bytes_of(h) < 0 || (byteOrder_ != kLittleEndian && byteOrder_ != kBigEndian)) return 1;
  const std::string hdr = name + ".hdr";
  int status = 1;
  switch (sar::metadata::header_dialect(hdr)) {
    case sar::metadata::HeaderDialect::kMissing:
    case sar::metadata::HeaderDialect::kXml:
      status = writeAuxiliaryFile(hdr, 1, kRasterInfoSection);
      break;
    case sar::metadata::HeaderDialect::kProfile:
      status = write_raster_header_profile(hdr, h);
      break;
    case sar::metadata::HeaderDialect::kOtherXml:
      break;
  }
  if (status != 0) return failed();
  if (write_vrt_sidecar({name, samples_, lines_, rowPrefix_, headerOffset_, cellType_, byteOrder_}) != 0) {
    sar::base::report(sar::base::kReportWarning, "Cannot write the VRT description " + vrt_sidecar_path(name));
  }
  return 0;
}

// ------------------------------------------------------------------------------ stream steps

int64_t BufferFile::stream_read(void* buffer, int64_t bytes, int64_t position) {
  if (position < 0) return -1;
  if (lastWasWrite_ || streamPosition_ != position) {
    if (fseeko(stream_.get(), static_cast<off_t>(position), SEEK_SET) != 0) {
      streamPosition_ = -1;
      return -1;
    }
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

int64_t BufferFile::stream_write(const void* buffer, int64_t bytes, int64_t position) {
  if (position < 0) return -1;
  if (!lastWasWrite_ || streamPosition_ != position) {
    if (fseeko(stream_.get(), static_cast<off_t>(position), SEEK_SET) != 0) {
      streamPosition_ = -1;
      return -1;
    }
  }
  lastWasWrite_ = true;
  const size_t put = std::fwrite(buffer, 1, static_cast<size_t>(bytes), stream_.get());
  streamPosition_ = position + static_cast<int64_t>(put);
  extent_ = std::max(extent_, streamPosition_);
  if (put < static_cast<size_t>(bytes)) {
    std::clearerr(stream_.get());
    streamPosition_ = -1;
  }
  return static_cast<int64_t>(put);
}

int64_t BufferFile::file_size() {
  if (lastWasWrite_) std::fflush(stream_.get());
  struct stat st {};
  if (fstat(fileno(stream_.get()), &st) != 0) return -1;
  return static_cast<int64_t>(st.st_size);
}

// Writes what the buffer holds for the file. `empty` then starts an empty buffer at the current
// position (the write-behind case); otherwise the contents stay as a clean read cache.
int BufferFile::flush(bool empty) {
  if (buffer_.empty()) return 0;
  const bool pending = (op_ == kOpWrite || dirty_) && validBytes_ > 0;
  if (pending && stream_write(buffer_.data(), validBytes_, bufferStart_) != validBytes_) return 1;
  dirty_ = false;
  if (empty) {
    bufferStart_ += positionInBuffer_;
    positionInBuffer_ = 0;
    validBytes_ = 0;
  }
  return 0;
}

int BufferFile::fill_at(int64_t start) {
  const int64_t got = stream_read(buffer_.data(), static_cast<int64_t>(buffer_.size()), start);
  bufferStart_ = start;
  positionInBuffer_ = 0;
  validBytes_ = got < 0 ? 0 : got;
  return got < 0 ? 1 : 0;
}

// Refill at the current position, keeping up to the keep-back of the bytes just behind it.
int BufferFile::refill() {
  if (flush(false) != 0) return 1;
  const int64_t position = tell();
  const int64_t keep = positionInBuffer_ == validBytes_ ? std::min(keepBack_, validBytes_ / 2) : 0;
  if (keep > 0) std::memmove(buffer_.data(), buffer_.data() + validBytes_ - keep, static_cast<size_t>(keep));
  const int64_t got =
      stream_read(buffer_.data() + keep, static_cast<int64_t>(buffer_.size()) - keep, position);
  bufferStart_ = position - keep;
  positionInBuffer_ = keep;
  validBytes_ = keep + (got < 0 ? 0 : got);
  return got < 0 ? 1 : 0;
}

// ------------------------------------------------------------------------------ open / close

int BufferFile::open(OperationType op) {
  if (is_open()) close();
  const char* how = nullptr;
  switch (op) {
    case kOpRead: how = "rb"; break;
    case kOpWrite: how = "w+b"; break;
    case kOpReadWrite: how = "r+b"; break;
    default: return 1;
  }
  if (fileName_.empty()) return failed();
  stream_.reset(std::fopen(fileName_.c_str(), how));
  if (!stream_) {
    op_ = kOpNone;
    return failed();
  }
  op_ = op;
  position_ = 0;
  bufferStart_ = 0;
  positionInBuffer_ = 0;
  validBytes_ = 0;
  dirty_ = false;
  streamPosition_ = 0;
  lastWasWrite_ = false;
  extent_ = 0;
  if (!buffer_.empty()) std::setvbuf(stream_.get(), nullptr, _IONBF, 0);
  return 0;
}

int BufferFile::close() {
  if (!is_open()) {
    buffer_.clear();
    return 0;
  }
  int status = flush(true);
  if (op_ != kOpRead && extent_ > 0) {
    const int64_t size = file_size();
    if (size >= 0 && size < extent_ && ftruncate(fileno(stream_.get()), static_cast<off_t>(extent_)) != 0) status = 1;
  }
  if (std::fclose(stream_.release()) != 0) status = 1;
  buffer_.clear();
  op_ = kOpNone;
  streamPosition_ = -1;
  return status == 0 ? 0 : failed();
}

int BufferFile::initbuffer(int64_t size, int64_t keepback) {
  if (is_open() && flush(true) != 0) return failed();
  const int64_t position = tell();
  if (size <= 0) {
    buffer_.clear();
    position_ = position;
    return 0;
  }
  buffer_.assign(static_cast<size_t>(size), 0);
  // Never more than half the buffer: a refill must always bring new bytes.
  keepBack_ = std::clamp<int64_t>(keepback, 0, size / 2);
  bufferStart_ = position;
  positionInBuffer_ = 0;
  validBytes_ = 0;
  dirty_ = false;
  if (!is_open()) return 0;
  std::setvbuf(stream_.get(), nullptr, _IONBF, 0);
  if (op_ == kOpRead) return fill_at(0) == 0 ? 0 : failed();
  if (op_ == kOpReadWrite) return fill_at(position) == 0 ? 0 : failed();
  return 0;
}

// ------------------------------------------------------------------------------ seek / read / write

int64_t BufferFile::tell() const { return buffer_.empty() ? position_ : bufferStart_ + positionInBuffer_; }

int BufferFile::seek(int64_t offset, SeekType origin) {
  if (!is_open()) return 1;
  int64_t base = 0;
  switch (origin) {
    case kSeekSet: base = 0; break;
    case kSeekCur: base = tell(); break;
    case kSeekEnd:
      if (flush(false) != 0) return failed();
      base = file_size();
      if (base < 0) return failed();
      break;
    default: return 1;
  }
  int64_t target = 0;
  if (__builtin_add_overflow(base, offset, &target) || target < 0) return 1;
  if (buffer_.empty()) {
    position_ = target;
    return 0;
  }
  if (target >= bufferStart_ && target <= bufferStart_ + validBytes_) {
    positionInBuffer_ = target - bufferStart_;
    return 0;
  }
  if (op_ == kOpWrite) {
    if (flush(true) != 0) return failed();
    bufferStart_ = target;
    positionInBuffer_ = 0;
    validBytes_ = 0;
    return 0;
  }
  if (flush(false) != 0) return failed();
  // A relative seek refills with the keep-back behind the target, so that the reader can step
  // back again without touching the stream.
  const int64_t start = origin == kSeekCur ? target - std::min(keepBack_, target) : target;
  if (fill_at(start) != 0) return failed();
  positionInBuffer_ = target - start;
  return 0;
}

int64_t BufferFile::read(void* buffer, int64_t bytes) {
  if (!is_open() || op_ == kOpWrite || bytes <= 0 || buffer == nullptr) return 0;
  auto* out = static_cast<unsigned char*>(buffer);
  if (buffer_.empty()) {
    const int64_t got = stream_read(out, bytes, position_);
    if (got < 0) {
      failed();
      return 0;
    }
    position_ += got;
    return got;
  }
  int64_t done = 0;
  while (done < bytes) {
    const int64_t avail = validBytes_ - positionInBuffer_;
    if (avail > 0) {
      const int64_t n = std::min(avail, bytes - done);
      std::memcpy(out + done, buffer_.data() + positionInBuffer_, static_cast<size_t>(n));
      positionInBuffer_ += n;
      done += n;
      continue;
    }
    if (refill() != 0) {
      failed();
      break;
    }
    // A refill that brings nothing new ends the read.
    if (validBytes_ <= positionInBuffer_) break;
  }
  return done;
}

int64_t BufferFile::write(const void* buffer, int64_t bytes) {
  if (!is_open() || op_ == kOpRead || bytes <= 0 || buffer == nullptr) return 0;
  const auto* in = static_cast<const unsigned char*>(buffer);
  if (buffer_.empty()) {
    const int64_t put = stream_write(in, bytes, position_);
    if (put < 0) return 0;
    position_ += put;
    if (put < bytes) failed();
    return put;
  }
  const auto capacity = static_cast<int64_t>(buffer_.size());
  int64_t done = 0;
  while (done < bytes) {
    if (positionInBuffer_ == capacity) {
      if (flush(true) != 0) {
        failed();
        return done;
      }
    }
    const int64_t remaining = bytes - done;
    if (validBytes_ == 0 && remaining >= capacity) {
      // Larger than the whole buffer: straight through, in order.
      const int64_t put = stream_write(in + done, remaining, bufferStart_);
      if (put > 0) bufferStart_ += put;
      if (put < remaining) {
        failed();
        return done + std::max<int64_t>(put, 0);
      }
      return bytes;
    }
    if (positionInBuffer_ > validBytes_) {
      // Sought past the end of the file: the gap is a hole of zeros, not stale buffer bytes.
      std::memset(buffer_.data() + validBytes_, 0, static_cast<size_t>(positionInBuffer_ - validBytes_));
    }
    const int64_t n = std::min(capacity - positionInBuffer_, remaining);
    std::memcpy(buffer_.data() + positionInBuffer_, in + done, static_cast<size_t>(n));
    positionInBuffer_ += n;
    validBytes_ = std::max(validBytes_, positionInBuffer_);
    dirty_ = true;
    done += n;
  }
  return done;
}

// ------------------------------------------------------------------------------ misc

int BufferFile::clone(const BufferFile& other) {
  if (&other == this) return 0;
  fileName_ = other.fileName_;
  lines_ = other.lines_;
  samples_ = other.samples_;
  rowPrefix_ = other.rowPrefix_;
  headerOffset_ = other.headerOffset_;
  cellType_ = other.cellType_;
  byteOrder_ = other.byteOrder_;
  return 0;
}

int BufferFile::copy(const std::string& path, int64_t chunkBytes) {
  if (is_open()) {
    if (flush(false) != 0) return failed();
    std::fflush(stream_.get());
  }
  const int64_t total = raster_bytes_of({lines_, samples_, headerOffset_, rowPrefix_, byteOrder_, cellType_});
  return copy_raster_bytes(fileName_, path, total, chunkBytes) == 0 ? 0 : failed();
}

int BufferFile::writeOffset(const void* header, int32_t bytes) {
  if (!is_open() || op_ == kOpRead || bytes < 0 || (header == nullptr && bytes > 0)) return 1;
  // Buffered bytes belong before the header goes in, in case they overlap it.
  if (flush(false) != 0) return failed();
  if (bytes > 0 && stream_write(header, bytes, 0) != bytes) return failed();
  if (!buffer_.empty()) {
    // Keep a read cache coherent with what was just written.
    const int64_t lo = std::max<int64_t>(0, bufferStart_);
    const int64_t hi = std::min<int64_t>(bytes, bufferStart_ + validBytes_);
    if (lo < hi) {
      std::memcpy(buffer_.data() + (lo - bufferStart_), static_cast<const unsigned char*>(header) + lo,
                  static_cast<size_t>(hi - lo));
    }
  }
  headerOffset_ = bytes;
  return 0;
}

// ------------------------------------------------------------------------------ windows

int BufferFile::check_window(int32_t memType, int64_t firstLine, int32_t lines, int32_t firstColumn,
                             int32_t& columns, bool writing) const {
  if (!cell_type_known(memType) || !cell_type_known(cellType_)) return 1;
  if (columns == 0 && firstColumn >= 0 && firstColumn <= samples_) columns = samples_ - firstColumn;
  const bool bad = firstLine < 0 || lines < 0 || firstColumn < 0 || columns < 0 || samples_ < 0 || rowPrefix_ < 0 ||
                   static_cast<int64_t>(firstColumn) + columns > samples_ ||
                   (!writing && firstLine + lines > static_cast<int64_t>(lines_)) ||
                   line_offset(firstLine + lines) < 0;
  return bad ? failed() : 0;
}

int BufferFile::read_window(void* buffer, int32_t memType, int64_t firstLine, int32_t lines, int32_t firstColumn,
                            int32_t columns) {
  if (const int st = check_window(memType, firstLine, lines, firstColumn, columns, false)) return st;
  if (lines == 0 || columns == 0) return 0;
  if (buffer == nullptr) return 1;
  if (!is_open() && open(kOpRead) != 0) return failed();
  if (op_ == kOpWrite) return 1;
  const int size = pixelsizeof();
  const int memSize = cell_size(memType);
  const int64_t window = static_cast<int64_t>(columns) * size;
  const int64_t before = rowPrefix_ + static_cast<int64_t>(firstColumn) * size;
  const int64_t after = static_cast<int64_t>(samples_ - firstColumn - columns) * size;
  const bool direct = memType == cellType_;
  std::vector<unsigned char> line(direct ? 0 : static_cast<size_t>(window));
  auto* out = static_cast<unsigned char*>(buffer);
  if (seek(line_offset(firstLine), kSeekSet) != 0) return failed();
  for (int32_t l = 0; l < lines; ++l) {
    unsigned char* dst = out + static_cast<int64_t>(l) * columns * memSize;
    unsigned char* raw = direct ? dst : line.data();
    if (seek(before, kSeekCur) != 0) return failed();
    if (read(raw, window) != window) return failed();
    if (seek(after, kSeekCur) != 0) return failed();
    cells_to_host(raw, cellType_, static_cast<size_t>(columns), byteOrder_);
    if (!direct) convert_cells(raw, cellType_, dst, memType, static_cast<size_t>(columns));
  }
  return 0;
}

int BufferFile::write_window(const void* buffer, int32_t memType, int64_t firstLine, int32_t lines,
                             int32_t firstColumn, int32_t columns) {
  if (const int st = check_window(memType, firstLine, lines, firstColumn, columns, true)) return st;
  if (lines == 0 || columns == 0) return 0;
  if (buffer == nullptr) return 1;
  if (!is_open() || op_ == kOpRead) return 1;
  const int size = pixelsizeof();
  const int memSize = cell_size(memType);
  const int64_t window = static_cast<int64_t>(columns) * size;
  const int64_t before = rowPrefix_ + static_cast<int64_t>(firstColumn) * size;
  const int64_t after = static_cast<int64_t>(samples_ - firstColumn - columns) * size;
  std::vector<unsigned char> line(static_cast<size_t>(window));
  const auto* in = static_cast<const unsigned char*>(buffer);
  if (seek(line_offset(firstLine), kSeekSet) != 0) return failed();
  for (int32_t l = 0; l < lines; ++l) {
    convert_cells(in + static_cast<int64_t>(l) * columns * memSize, memType, line.data(), cellType_,
                  static_cast<size_t>(columns));
    cells_from_host(line.data(), cellType_, static_cast<size_t>(columns), byteOrder_);
    if (seek(before, kSeekCur) != 0) return failed();
    if (write(line.data(), window) != window) return failed();
    if (seek(after, kSeekCur) != 0) return failed();
    extent_ = std::max(extent_, line_offset(firstLine + l + 1));
  }
  return 0;
}

int BufferFile::readprefix(void* buffer, int64_t firstLine, int32_t lines) {
  int32_t columns = 0;
  if (const int st = check_window(cellType_, firstLine, lines, 0, columns, false)) return st;
  if (lines == 0 || rowPrefix_ == 0) return 0;
  if (buffer == nullptr) return 1;
  if (!is_open() && open(kOpRead) != 0) return failed();
  if (op_ == kOpWrite) return 1;
  const int64_t cells = static_cast<int64_t>(samples_) * pixelsizeof();
  auto* out = static_cast<unsigned char*>(buffer);
  if (seek(line_offset(firstLine), kSeekSet) != 0) return failed();
  for (int32_t l = 0; l < lines; ++l) {
    unsigned char* dst = out + static_cast<int64_t>(l) * rowPrefix_;
    if (read(dst, rowPrefix_) != rowPrefix_) return failed();
    prefix_swap(dst, static_cast<size_t>(rowPrefix_), byteOrder_);
    if (seek(cells, kSeekCur) != 0) return failed();
  }
  return 0;
}

int BufferFile::writeprefix(const void* buffer, int64_t firstLine, int32_t lines) {
  int32_t columns = 0;
  if (const int st = check_window(cellType_, firstLine, lines, 0, columns, true)) return st;
  if (lines == 0 || rowPrefix_ == 0) return 0;
  if (buffer == nullptr) return 1;
  if (!is_open() || op_ == kOpRead) return 1;
  const int64_t cells = static_cast<int64_t>(samples_) * pixelsizeof();
  const auto* in = static_cast<const unsigned char*>(buffer);
  std::vector<unsigned char> prefix(static_cast<size_t>(rowPrefix_));
  if (seek(line_offset(firstLine), kSeekSet) != 0) return failed();
  for (int32_t l = 0; l < lines; ++l) {
    std::memcpy(prefix.data(), in + static_cast<int64_t>(l) * rowPrefix_, prefix.size());
    prefix_swap(prefix.data(), prefix.size(), byteOrder_);
    if (write(prefix.data(), rowPrefix_) != rowPrefix_) return failed();
    if (seek(cells, kSeekCur) != 0) return failed();
    extent_ = std::max(extent_, line_offset(firstLine + l + 1));
  }
  return 0;
}

float BufferFile::readFloat(int64_t line, int32_t column) {
  float v = 0.0f;
  return readbuffer(&v, line, 1, column, 1) == 0 ? v : 0.0f;
}

double BufferFile::readDouble(int64_t line, int32_t column) {
  double v = 0.0;
  return readbuffer(&v, line, 1, column, 1) == 0 ? v : 0.0;
}

int32_t BufferFile::readInt(int64_t line, int32_t column) {
  int32_t v = 0;
  return readbuffer(&v, line, 1, column, 1) == 0 ? v : 0;
}

int16_t BufferFile::readShort(int64_t line, int32_t column) {
  int16_t v = 0;
  return readbuffer(&v, line, 1, column, 1) == 0 ? v : int16_t{0};
}

fcomplex BufferFile::readFloatComplex(int64_t line, int32_t column) {
  fcomplex v{};
  return readbuffer(&v, line, 1, column, 1) == 0 ? v : fcomplex{};
}

dcomplex BufferFile::readDoubleComplex(int64_t line, int32_t column) {
  dcomplex v{};
  return readbuffer(&v, line, 1, column, 1) == 0 ? v : dcomplex{};
}

}  // namespace sar::io

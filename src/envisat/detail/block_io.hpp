#pragma once
// Block I/O of the level 0 walk: the product read in large blocks with views into the block
// instead of copies, and output files written a block of lines at a time.
//
// The product is read with pread(2) into one block of `kBlockBytes`; a head or a payload is
// handed out as a view into the block, valid until the next call on the reader. Seeks inside the
// block are pointer moves, so the look-ahead over the next packets and the step back over a head
// cost no system call.
//
// An output file gathers lines in a block of a few megabytes and writes it whole. An existing
// file is overwritten in place and cut to the written length when it is committed: truncating a
// large file to zero and writing it again makes ext4 force the new data to disk at close (its
// replace-by-truncate heuristic), which costs seconds per product, while rewriting pages already
// cached costs only the copy.
#include <fcntl.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstdint>
#include <cstdio>
#include <cstring>
#include <filesystem>
#include <span>
#include <string>
#include <utility>
#include <vector>

#include "base/errors.hpp"

namespace sar::envisat::detail {

inline std::string byte_text(std::int64_t pos, std::int64_t size) {
  char t[96];
  std::snprintf(t, sizeof t, "byte %lld of %lld", static_cast<long long>(pos), static_cast<long long>(size));
  return t;
}

/// A file descriptor closed on scope exit.
class FileDescriptor {
 public:
  FileDescriptor() = default;
  explicit FileDescriptor(int fd) : fd_(fd) {}
  FileDescriptor(FileDescriptor&& o) noexcept : fd_(std::exchange(o.fd_, -1)) {}
  FileDescriptor& operator=(FileDescriptor&& o) noexcept {
    if (this != &o) {
      reset();
      fd_ = std::exchange(o.fd_, -1);
    }
    return *this;
  }
  FileDescriptor(const FileDescriptor&) = delete;
  FileDescriptor& operator=(const FileDescriptor&) = delete;
  ~FileDescriptor() { reset(); }
  int get() const { return fd_; }
  explicit operator bool() const { return fd_ >= 0; }
  /// Closes now; returns close(2)'s result (0 when nothing was open).
  int reset() {
    const int fd = std::exchange(fd_, -1);
    return fd >= 0 ? ::close(fd) : 0;
  }

 private:
  int fd_ = -1;
};

/// Sequential reader of the product with every read checked against the file size: a read that
/// would pass the end is a truncated product.
class ProductReader {
 public:
  /// Bytes read per system call; a view never needs more than one packet (below 64 KiB).
  static constexpr std::int64_t kBlockBytes = 0x100000;

  ProductReader(std::string path, std::int64_t size)
      : path_(std::move(path)), size_(size), block_(static_cast<std::size_t>(kBlockBytes)) {
    file_ = FileDescriptor(::open(path_.c_str(), O_RDONLY | O_CLOEXEC));
    if (!file_) sar::base::input_fault(sar::base::InputFault::kMissing, sar::base::ec::kFileIo, {path_, "level 0 product cannot be opened"});
    ::posix_fadvise(file_.get(), 0, 0, POSIX_FADV_SEQUENTIAL);
  }
  std::int64_t pos() const { return pos_; }
  std::int64_t size() const { return size_; }
  const std::string& path() const { return path_; }

  void seek(std::int64_t to) {
    if (to < 0 || to > size_)
      sar::base::input_fault(sar::base::InputFault::kTruncated, sar::base::ec::kFileIo, {path_, "seek outside the level 0 product", byte_text(to, size_)});
    pos_ = to;
  }

  /// The next `n` bytes, as a view valid until the next call on the reader; a product that ends
  /// first is truncated.
  std::span<const std::uint8_t> view(std::int64_t n, const char* what) {
    if (n < 0 || n > size_ - pos_)
      sar::base::input_fault(sar::base::InputFault::kTruncated, sar::base::ec::kFileIo,
                       {path_, std::string("level 0 product truncated in ") + what, byte_text(pos_, size_)});
    if (n > kBlockBytes)
      sar::base::input_fault(sar::base::InputFault::kTruncated, sar::base::ec::kFileIo, {path_, std::string("read larger than the block in ") + what,
                                                 byte_text(pos_, size_)});
    if (pos_ < blockStart_ || pos_ + n > blockStart_ + blockLength_) fill(n, what);
    const auto at = static_cast<std::size_t>(pos_ - blockStart_);
    pos_ += n;
    return {block_.data() + at, static_cast<std::size_t>(n)};
  }

  /// Reads exactly `out.size()` bytes.
  void read(std::span<std::uint8_t> out, const char* what) {
    const auto v = view(static_cast<std::int64_t>(out.size()), what);
    std::copy(v.begin(), v.end(), out.begin());
  }

  /// Reads up to `out.size()` bytes, any count; returns the count.
  std::int64_t read_some(std::span<std::uint8_t> out) {
    const std::int64_t want = std::min<std::int64_t>(static_cast<std::int64_t>(out.size()), size_ - pos_);
    std::int64_t done = 0;
    while (done < want) {
      const std::int64_t n = std::min(want - done, kBlockBytes);
      const auto v = view(n, "a search for a packet header");
      std::copy(v.begin(), v.end(), out.begin() + done);
      done += n;
    }
    return done;
  }

 private:
  // Makes [pos_, pos_ + n) resident, keeping what the block already holds of it, then reads on
  // as far as the block and the file allow.
  void fill(std::int64_t n, const char* what) {
    std::int64_t keep = 0;
    if (pos_ >= blockStart_ && pos_ < blockStart_ + blockLength_) {
      keep = blockStart_ + blockLength_ - pos_;
      std::memmove(block_.data(), block_.data() + (pos_ - blockStart_), static_cast<std::size_t>(keep));
    }
    blockStart_ = pos_;
    blockLength_ = keep;
    const std::int64_t end = std::min(size_, blockStart_ + kBlockBytes);
    while (blockLength_ < n || blockStart_ + blockLength_ < end) {
      const std::int64_t at = blockStart_ + blockLength_;
      const ssize_t got = ::pread(file_.get(), block_.data() + blockLength_, static_cast<std::size_t>(end - at),
                                  static_cast<off_t>(at));
      if (got < 0 && errno == EINTR) continue;
      if (got <= 0) {
        if (blockLength_ >= n) break;  // what is needed is there; the rest can wait
        blockLength_ = 0;
        sar::base::input_fault(sar::base::InputFault::kMalformed, sar::base::ec::kFileIo,
                         {path_, std::string("read failed in ") + what, byte_text(at, size_)});
      }
      blockLength_ += got;
    }
  }

  std::string path_;
  std::int64_t size_;
  std::int64_t pos_ = 0;
  FileDescriptor file_;
  std::vector<std::uint8_t> block_;
  std::int64_t blockStart_ = 0;
  std::int64_t blockLength_ = 0;
};

/// An output file that is removed again unless the extraction completes. Lines gather in a
/// block of `kBlockBytes` that is written whole, so the file system sees few large writes (ext4
/// walks every block buffer of a page-cache folio on each write, whatever its length).
class OutputFile {
 public:
  static constexpr std::size_t kBlockBytes = 0x400000;

  OutputFile() = default;
  explicit OutputFile(std::string path) : path_(std::move(path)) {
    // No O_TRUNC: an earlier file of the same name is overwritten in place and cut at commit.
    file_ = FileDescriptor(::open(path_.c_str(), O_WRONLY | O_CREAT | O_CLOEXEC, 0666));
    if (!file_) sar::base::fatal(sar::base::ec::kFileIo, {path_, "output file cannot be created"});
  }
  OutputFile(OutputFile&& o) noexcept { take(o); }
  OutputFile& operator=(OutputFile&& o) noexcept {
    if (this != &o) {
      discard();
      take(o);
    }
    return *this;
  }
  OutputFile(const OutputFile&) = delete;
  OutputFile& operator=(const OutputFile&) = delete;
  ~OutputFile() { discard(); }

  bool is_open() const { return static_cast<bool>(file_); }

  /// Appends `bytes`.
  void write(const void* data, std::size_t bytes) {
    const auto* p = static_cast<const std::uint8_t*>(data);
    while (bytes > 0) {
      if (block_.capacity() < kBlockBytes) block_.reserve(kBlockBytes);
      const std::size_t n = std::min(bytes, kBlockBytes - block_.size());
      block_.insert(block_.end(), p, p + n);
      p += n;
      bytes -= n;
      if (block_.size() == kBlockBytes) flush();
    }
  }

  void commit() {
    if (!file_) return;
    flush();
    if (::ftruncate(file_.get(), static_cast<off_t>(written_)) != 0) fail("output file cannot be cut to its length");
    if (file_.reset() != 0) fail("close failed");
    committed_ = true;
  }

 private:
  void flush() {
    for (std::size_t done = 0; done < block_.size();) {
      const ssize_t n = ::write(file_.get(), block_.data() + done, block_.size() - done);
      if (n < 0 && errno == EINTR) continue;
      if (n <= 0) fail("write failed");
      done += static_cast<std::size_t>(n);
    }
    written_ += block_.size();
    block_.clear();
  }

  [[noreturn]] void fail(const char* what) { sar::base::fatal(sar::base::ec::kFileIo, {path_, what}); }

  void take(OutputFile& o) {
    path_ = std::move(o.path_);
    file_ = std::move(o.file_);
    block_ = std::move(o.block_);
    written_ = o.written_;
    committed_ = o.committed_;
  }

  void discard() {
    if (file_ && !committed_) {
      file_.reset();
      std::error_code err;
      std::filesystem::remove(path_, err);
    }
  }

  std::string path_;
  FileDescriptor file_;
  std::vector<std::uint8_t> block_;
  std::uint64_t written_ = 0;
  bool committed_ = false;
};

}  // namespace sar::envisat::detail

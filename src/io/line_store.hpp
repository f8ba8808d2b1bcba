#pragma once
// Lines of fixed size passed between two stages of one process without a file.
//
// The extraction appends its lines (a time and the samples, as in the line file) and range
// compression takes them out in order. The lines live in chunks of about 64 MiB, each holding
// whole lines; a chunk is given back to the system as soon as every line in it has been taken,
// so the store and the matrix that receives its lines together never hold much more than one of
// them. Chunks this large are mapped pages of their own, so freeing one returns its memory;
// they are advised for huge pages, so that filling a scene's gigabyte takes a few hundred page
// faults instead of a few hundred thousand.
#include <cstddef>
#include <cstdint>
#include <memory>
#include <vector>

namespace sar::io {

class LineStore {
 public:
  static constexpr std::size_t kChunkBytes = std::size_t{64} << 20;

  /// A store of lines of `lineBytes` bytes (at least 1), in chunks of about `chunkBytes`.
  explicit LineStore(std::size_t lineBytes, std::size_t chunkBytes = kChunkBytes);

  std::size_t line_bytes() const { return lineBytes_; }
  /// Lines a chunk holds: a reader that frees as it goes takes them this many at a time.
  std::size_t lines_per_chunk() const { return linesPerChunk_; }
  /// Whole lines appended so far.
  std::int64_t lines() const { return static_cast<std::int64_t>(bytes_ / lineBytes_); }

  /// Appends `bytes` bytes; a line may come in several pieces (its time, then its samples).
  void append(const void* data, std::size_t bytes);

  /// Start of line `i`, which must be whole and not released.
  const std::byte* line(std::int64_t i) const;

  /// Releases every chunk whose lines all lie below line `end`.
  void release_below(std::int64_t end);

 private:
  std::size_t lineBytes_;
  std::size_t linesPerChunk_;
  std::size_t bytes_ = 0;  // appended so far
  struct Free {
    void operator()(std::byte* p) const noexcept;
  };
  std::vector<std::unique_ptr<std::byte[], Free>> chunks_;
};

}  // namespace sar::io

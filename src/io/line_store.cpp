#include "io/line_store.hpp"

#include <algorithm>
#include <cstring>
#include <stdexcept>

namespace sar::io {

LineStore::LineStore(std::size_t lineBytes, std::size_t chunkBytes)
    : lineBytes_(std::max<std::size_t>(lineBytes, 1)), linesPerChunk_(std::max<std::size_t>(chunkBytes / lineBytes_, 1)) {}

void LineStore::append(const void* data, std::size_t bytes) {
  const auto* p = static_cast<const std::byte*>(data);
  const std::size_t chunkBytes = linesPerChunk_ * lineBytes_;
  while (bytes > 0) {
    const std::size_t chunk = bytes_ / chunkBytes;
    const std::size_t at = bytes_ % chunkBytes;
    if (chunk == chunks_.size()) chunks_.push_back(std::make_unique_for_overwrite<std::byte[]>(chunkBytes));
    if (!chunks_[chunk]) throw std::logic_error("line store: append after release");
    const std::size_t n = std::min(bytes, chunkBytes - at);
    std::memcpy(chunks_[chunk].get() + at, p, n);
    p += n;
    bytes -= n;
    bytes_ += n;
  }
}

const std::byte* LineStore::line(std::int64_t i) const {
  if (i < 0 || i >= lines()) throw std::out_of_range("line store: no such line");
  const auto u = static_cast<std::size_t>(i);
  const auto& chunk = chunks_[u / linesPerChunk_];
  if (!chunk) throw std::logic_error("line store: line already released");
  return chunk.get() + (u % linesPerChunk_) * lineBytes_;
}

void LineStore::release_below(std::int64_t end) {
  if (end <= 0) return;
  // The last chunk may be partly filled: it goes once every line appended has been taken.
  const std::size_t whole = end >= lines() ? chunks_.size()
                                           : std::min(static_cast<std::size_t>(end) / linesPerChunk_, chunks_.size());
  for (std::size_t c = 0; c < whole; ++c) chunks_[c].reset();
}

}  // namespace sar::io

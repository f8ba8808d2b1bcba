#include "io/line_store.hpp"

#include <sys/mman.h>

#include <algorithm>
#include <cstdlib>
#include <cstring>
#include <new>
#include <stdexcept>

#include "base/diagnostics.hpp"

namespace sar::io {

namespace {

constexpr std::size_t kHugePage = std::size_t{2} << 20;

std::byte* allocate_chunk(std::size_t bytes) {
  const std::size_t rounded = (bytes + kHugePage - 1) / kHugePage * kHugePage;
  void* p = std::aligned_alloc(kHugePage, rounded);
  if (!p) throw std::bad_alloc();
  // Advice only: without huge pages it fails, which changes nothing and must leave no errno
  // behind for the callers' frames to report.
  const base::ErrnoGuard keep;
  ::madvise(p, rounded, MADV_HUGEPAGE);
  return static_cast<std::byte*>(p);
}

}  // namespace

void LineStore::Free::operator()(std::byte* p) const noexcept { std::free(p); }

LineStore::LineStore(std::size_t lineBytes, std::size_t chunkBytes)
    : lineBytes_(std::max<std::size_t>(lineBytes, 1)), linesPerChunk_(std::max<std::size_t>(chunkBytes / lineBytes_, 1)) {}

void LineStore::append(const void* data, std::size_t bytes) {
  const auto* p = static_cast<const std::byte*>(data);
  const std::size_t chunkBytes = linesPerChunk_ * lineBytes_;
  while (bytes > 0) {
    const std::size_t chunk = bytes_ / chunkBytes;
    const std::size_t at = bytes_ % chunkBytes;
    if (chunk == chunks_.size()) chunks_.emplace_back(allocate_chunk(chunkBytes));
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

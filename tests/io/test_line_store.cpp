// The in-memory line store between extraction and range compression: lines written in pieces
// across chunk boundaries read back whole, and released chunks are gone.
#include <gtest/gtest.h>

#include <cstdint>
#include <cstring>
#include <stdexcept>
#include <vector>

#include "io/line_store.hpp"

using sar::io::LineStore;

namespace {
std::vector<std::uint8_t> line_bytes(std::size_t bytes, int line) {
  std::vector<std::uint8_t> v(bytes);
  for (std::size_t k = 0; k < bytes; ++k) v[k] = static_cast<std::uint8_t>(line * 31 + k * 7);
  return v;
}
}  // namespace

TEST(LineStore, PiecesAcrossChunksReadBackWhole) {
  struct Case {
    std::size_t lineBytes, chunkBytes;
    int lines;
  };
  // Chunks of several lines with a remainder, exactly one line, and smaller than a line.
  for (const Case c : {Case{100, 350, 11}, Case{64, 64, 5}, Case{300, 100, 4}}) {
    SCOPED_TRACE(testing::Message() << c.lineBytes << " bytes a line, chunks of " << c.chunkBytes);
    LineStore store(c.lineBytes, c.chunkBytes);
    for (int l = 0; l < c.lines; ++l) {
      const auto v = line_bytes(c.lineBytes, l);
      // A prefix of 4 bytes, then the rest, as the extraction writes a line.
      store.append(v.data(), 4);
      store.append(v.data() + 4, v.size() - 4);
      EXPECT_EQ(store.lines(), l + 1);
    }
    for (int l = 0; l < c.lines; ++l) {
      const auto v = line_bytes(c.lineBytes, l);
      EXPECT_EQ(0, std::memcmp(store.line(l), v.data(), v.size())) << "line " << l;
    }
    EXPECT_THROW(store.line(c.lines), std::out_of_range);
  }
}

TEST(LineStore, ReleasedChunksAreGoneAndTheRestStays) {
  LineStore store(10, 30);  // three lines a chunk
  ASSERT_EQ(store.lines_per_chunk(), 3u);
  for (int l = 0; l < 8; ++l) {
    const auto v = line_bytes(10, l);
    store.append(v.data(), v.size());
  }
  store.release_below(5);  // frees lines 0 to 2 only: line 5 shares a chunk with 3 and 4
  EXPECT_THROW(store.line(2), std::logic_error);
  EXPECT_EQ(0, std::memcmp(store.line(3), line_bytes(10, 3).data(), 10));
  store.release_below(8);  // all taken: the partly filled last chunk goes too
  EXPECT_THROW(store.line(7), std::logic_error);
}

// Sequential streams and typed windows through BufferFile.
#include <gtest/gtest.h>

#include <cstring>
#include <filesystem>
#include <numeric>
#include <string>
#include <vector>

#include "io/buffer_file.hpp"
#include "io_test_util.hpp"

namespace fs = std::filesystem;
using namespace sar::io;
using sar::io::test::decode_part;
using sar::io::test::slurp;

namespace {

class BufferFileTest : public sar::io::test::TempDirTest {};

std::vector<unsigned char> pattern(size_t n) {
  std::vector<unsigned char> v(n);
  for (size_t i = 0; i < n; ++i) v[i] = static_cast<unsigned char>((i * 2654435761u) >> 11);
  return v;
}

TEST_F(BufferFileTest, StreamsThroughSmallBuffersInBothDirections) {
  const std::string path = file("stream.raw");
  const std::vector<unsigned char> data = pattern(300000);
  // Irregular request sizes, one of them larger than the whole buffer.
  const size_t sizes[] = {1, 4095, 4096, 4097, 17, 9000, 333, 2};
  {
    BufferFile w(path);
    ASSERT_EQ(w.open(BufferFile::kOpWrite), 0);
    ASSERT_EQ(w.initbuffer(4096, 0), 0);
    size_t at = 0;
    for (int i = 0; at < data.size(); ++i) {
      const size_t n = std::min(sizes[i % 8], data.size() - at);
      ASSERT_EQ(w.write(data.data() + at, static_cast<int64_t>(n)), static_cast<int64_t>(n));
      at += n;
    }
    EXPECT_EQ(w.read(nullptr, 10), 0);  // write-only
    ASSERT_EQ(w.close(), 0);
  }
  EXPECT_EQ(slurp(path), data);

  BufferFile r(path);
  ASSERT_EQ(r.open(BufferFile::kOpRead), 0);
  ASSERT_EQ(r.initbuffer(4096, 1024), 0);
  std::vector<unsigned char> back(data.size() + 100);
  size_t at = 0;
  for (int i = 0; at < back.size(); ++i) {
    const size_t n = std::min(sizes[(i + 3) % 8], back.size() - at);
    const int64_t got = r.read(back.data() + at, static_cast<int64_t>(n));
    if (got == 0) break;
    at += static_cast<size_t>(got);
  }
  EXPECT_EQ(at, data.size());  // the end of the file ends the read quietly
  back.resize(at);
  EXPECT_EQ(back, data);
  EXPECT_EQ(r.write(data.data(), 1), 0);  // read-only
  EXPECT_EQ(r.tell(), static_cast<int64_t>(data.size()));
  ASSERT_EQ(r.seek(-10, BufferFile::kSeekEnd), 0);
  unsigned char last[10];
  ASSERT_EQ(r.read(last, 10), 10);
  EXPECT_EQ(std::memcmp(last, data.data() + data.size() - 10, 10), 0);
}

TEST_F(BufferFileTest, BackwardSeeksInsideTheKeptTailNeedNoStream) {
  const std::string path = file("keep.raw");
  const std::vector<unsigned char> data = pattern(10000);
  sar::io::test::put_text(path, std::string(data.begin(), data.end()));
  BufferFile r(path);
  ASSERT_EQ(r.open(BufferFile::kOpRead), 0);
  ASSERT_EQ(r.initbuffer(1000, 200), 0);
  std::vector<unsigned char> chunk(1100);
  ASSERT_EQ(r.read(chunk.data(), 1100), 1100);  // one refill behind us, keeping 200 bytes

  // Change the file under the reader: what comes from the buffer is the old content.
  sar::io::test::poke(path, 700, std::vector<unsigned char>(300, 0xAB));
  ASSERT_EQ(r.seek(-150, BufferFile::kSeekCur), 0);
  unsigned char b = 0;
  ASSERT_EQ(r.read(&b, 1), 1);
  EXPECT_EQ(b, data[950]);
  // Further back than the tail: the stream is read again and shows the change.
  ASSERT_EQ(r.seek(750, BufferFile::kSeekSet), 0);
  ASSERT_EQ(r.read(&b, 1), 1);
  EXPECT_EQ(b, 0xAB);
}

TEST_F(BufferFileTest, TypedWindowsHeadersAndPrefixes) {
  for (int order : {kLittleEndian, kBigEndian}) {
    SCOPED_TRACE(order);
    const std::string path = file(sar::io::test::numbered("w", order));
    const int samples = 6;
    const int lines = 5;
    std::vector<fcomplex> image(static_cast<size_t>(samples * lines));
    for (int i = 0; i < samples * lines; ++i) image[i] = {i + 0.5f, -2.0f * i};
    std::vector<unsigned char> prefix(static_cast<size_t>(lines * 8));
    std::iota(prefix.begin(), prefix.end(), 1);
    {
      BufferFile w(path);
      w.setSamples(samples);
      w.setLines(lines);
      w.setRowPrefix(8);
      w.setType(kShortComplex);
      w.setFileEndian(order);
      ASSERT_EQ(w.open(BufferFile::kOpWrite), 0);
      ASSERT_EQ(w.initbuffer(64, 0), 0);
      ASSERT_EQ(w.writeOffset("HEAD", 4), 0);
      EXPECT_EQ(w.getOffsetSize(), 4);
      ASSERT_EQ(w.writeprefix(prefix.data(), 0, lines), 0);
      ASSERT_EQ(w.writebuffer(image.data(), 0, lines, 0, 0), 0);
      ASSERT_EQ(w.close(), 0);
      ASSERT_EQ(w.writehdr(), 0);
    }
    const std::vector<unsigned char> bytes = slurp(path);
    ASSERT_EQ(bytes.size(), 4u + lines * (samples * 4 + 8));
    EXPECT_EQ(std::string(bytes.begin(), bytes.begin() + 4), "HEAD");
    // Line 1, sample 2: rounded half away from zero, in the file's order.
    EXPECT_EQ(decode_part<int16_t>(bytes, 4 + (samples * 4 + 8) + 8 + 2 * 4, order), 9);
    EXPECT_EQ(decode_part<int16_t>(bytes, 4 + (samples * 4 + 8) + 8 + 2 * 4 + 2, order), -16);

    BufferFile r;
    ASSERT_EQ(r.readhdr(path), 0);
    EXPECT_EQ(r.getType(), kShortComplex);
    EXPECT_EQ(r.getFileEndian(), order);
    EXPECT_EQ(r.getOffsetSize(), 4);
    ASSERT_EQ(r.open(BufferFile::kOpRead), 0);
    ASSERT_EQ(r.initbuffer(50, 16), 0);
    std::vector<fcomplex> all(image.size());
    ASSERT_EQ(r.readbuffer(all.data(), 0, lines, 0, 0), 0);  // 0 columns: whole lines
    for (size_t i = 0; i < all.size(); ++i) {
      EXPECT_EQ(all[i].real(), std::round(image[i].real())) << i;
      EXPECT_EQ(all[i].imag(), image[i].imag()) << i;
    }
    double re[2];
    ASSERT_EQ(r.readbuffer(re, 3, 1, 4, 2), 0);
    EXPECT_EQ(re[0], 23.0);  // 22.5 rounded away from zero
    EXPECT_EQ(r.readShort(4, 5), 30);
    EXPECT_EQ(r.readFloatComplex(2, 1), fcomplex(14.0f, -26.0f));
    EXPECT_EQ(r.readDoubleComplex(0, 0), dcomplex(1.0, 0.0));
    EXPECT_EQ(r.readInt(1, 0), 7);
    std::vector<unsigned char> p(static_cast<size_t>(2 * 8));
    ASSERT_EQ(r.readprefix(p.data(), 3, 2), 0);
    EXPECT_TRUE(std::equal(p.begin(), p.end(), prefix.begin() + 24));
    // Outside the raster.
    EXPECT_EQ(r.readbuffer(re, 4, 2, 0, 1), 1);
    EXPECT_EQ(r.readbuffer(re, 0, 1, 5, 2), 1);
    EXPECT_TRUE(fs::exists(path + ".vrt"));
  }
}

TEST_F(BufferFileTest, ReadWriteUpdatesInPlace) {
  const std::string path = file("rw.raw");
  std::vector<float> v(40);
  std::iota(v.begin(), v.end(), 0.0f);
  {
    BufferFile w(path);
    w.setSamples(10);
    w.setLines(4);
    w.setType(kFloat32);
    ASSERT_EQ(w.open(BufferFile::kOpWrite), 0);
    ASSERT_EQ(w.writebuffer(v.data(), 0, 4, 0, 10), 0);
    ASSERT_EQ(w.close(), 0);
  }
  BufferFile u(path);
  u.setSamples(10);
  u.setLines(4);
  u.setType(kFloat32);
  ASSERT_EQ(u.open(BufferFile::kOpReadWrite), 0);
  ASSERT_EQ(u.initbuffer(64, 16), 0);
  float line[10];
  ASSERT_EQ(u.readbuffer(line, 2, 1, 0, 10), 0);
  for (float& x : line) x *= -1.0f;
  ASSERT_EQ(u.writebuffer(line, 2, 1, 0, 10), 0);
  float check = 0.0f;
  ASSERT_EQ(u.readbuffer(&check, 2, 1, 3, 1), 0);  // read back before any flush
  EXPECT_EQ(check, -23.0f);
  ASSERT_EQ(u.close(), 0);
  const std::vector<unsigned char> bytes = slurp(path);
  ASSERT_EQ(bytes.size(), 160u);
  EXPECT_EQ(decode_part<float>(bytes, 4 * 25, 0), -25.0f);
  EXPECT_EQ(decode_part<float>(bytes, 4 * 35, 0), 35.0f);
}

TEST_F(BufferFileTest, UnsetTypeHasNoCellSize) {
  BufferFile b(file("unset.raw"));
  EXPECT_EQ(b.getType(), kCellUnset);
  EXPECT_EQ(b.pixelsizeof(), 0);
  b.setSamples(4);
  b.setLines(1);
  float out[4];
  EXPECT_EQ(b.readbuffer(out, 0, 1, 0, 4), 1);
  EXPECT_EQ(b.writehdr(), 1);
  EXPECT_FALSE(fs::exists(file("unset.raw.hdr")));
  EXPECT_EQ(b.readhdr(file("missing")), 1);
  EXPECT_FALSE(fs::exists(file("missing.hdr")));
}

}  // namespace

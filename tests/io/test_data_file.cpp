// Rasters through DataFile and BufferIO: layouts, cell types, byte orders, headers, bad input.
#include <gtest/gtest.h>

#include <cmath>
#include <cstdio>
#include <cstring>
#include <filesystem>
#include <limits>
#include <string>
#include <tuple>
#include <vector>

#include "io/data_file.hpp"
#include "io_test_util.hpp"

namespace fs = std::filesystem;
using namespace sar::io;
using sar::io::test::decode_part;
using sar::io::test::slurp;

namespace {

// Test-side codec of one part, written without the engine's conversion and swap code.
int part_size(int type) { return cell_size(type) / cell_parts(type); }

double decode(const std::vector<unsigned char>& b, size_t at, int type, int order) {
  const bool is_float = type <= 3;
  switch (part_size(type)) {
    case 8: return is_float ? decode_part<double>(b, at, order) : 0.0;
    case 4: return is_float ? decode_part<float>(b, at, order) : decode_part<int32_t>(b, at, order);
    case 2: return decode_part<int16_t>(b, at, order);
    default: return std::nan("");
  }
}

void encode(std::vector<unsigned char>& b, size_t at, int type, int order, double v) {
  unsigned char tmp[8];
  const int n = part_size(type);
  if (type <= 3 && n == 8) {
    std::memcpy(tmp, &v, 8);
  } else if (type <= 3) {
    const float f = static_cast<float>(v);
    std::memcpy(tmp, &f, 4);
  } else if (n == 4) {
    const auto i = static_cast<int32_t>(v);
    std::memcpy(tmp, &i, 4);
  } else {
    const auto s = static_cast<int16_t>(v);
    std::memcpy(tmp, &s, 2);
  }
  if (b.size() < at + n) b.resize(at + n);
  for (int i = 0; i < n; ++i) b[at + i] = tmp[order == 1 ? n - 1 - i : i];
}

// Values that every type holds exactly and that differ per line, column and part.
double value(int type, int line, int col, int part) {
  return type >= 4 ? line * 100 + col * 7 - part * 50 - 30 : (line * 100 + col * 3 + part) * 0.5 - 20.25;
}

struct Layout {
  int64_t offset;
  int32_t prefix;
};
constexpr Layout kLayouts[] = {{0, 0}, {7, 3}, {64, 12}};
constexpr int kPixels = 5;
constexpr int kLines = 4;

using RoundTripParam = std::tuple<int, int, int, int>;  // type, order, layout, buffer size

class RasterRoundTrip : public sar::io::test::TempDirTest, public ::testing::WithParamInterface<RoundTripParam> {};

TEST_P(RasterRoundTrip, WindowsPrefixesAndHeader) {
  const auto [type, order, layoutIndex, bufferSize] = GetParam();
  const Layout layout = kLayouts[layoutIndex];
  const std::string path = file("r.raw");
  const int size = cell_size(type);
  const int parts = cell_parts(type);
  const int ps = size / parts;

  std::vector<unsigned char> mem(static_cast<size_t>(kPixels * kLines * size));
  for (int l = 0; l < kLines; ++l)
    for (int c = 0; c < kPixels; ++c)
      for (int p = 0; p < parts; ++p) encode(mem, (l * kPixels + c) * size + p * ps, type, 0, value(type, l, c, p));
  std::vector<unsigned char> prefixes(static_cast<size_t>(kLines * layout.prefix));
  for (size_t i = 0; i < prefixes.size(); ++i) prefixes[i] = static_cast<unsigned char>(i * 13 + 1);

  {
    DataFile w(path);
    w.pixels = kPixels;
    w.lines = kLines;
    w.rowPrefix = layout.prefix;
    w.headerOffset = layout.offset;
    w.cellType = type;
    w.byteOrder = order;
    w.bufferSize = bufferSize;
    BufferIO all(&w, 0, kPixels, 0, kLines, type);
    ASSERT_EQ(all.writeprefix(prefixes.data()), 0);
    ASSERT_EQ(all.writebuffer(mem.data()), 0);
    ASSERT_EQ(w.close(), 0);
    ASSERT_EQ(w.write_hdr(), 0);
    EXPECT_EQ(static_cast<int64_t>(fs::file_size(path)), w.raster_bytes());
  }

  // On disk, in the file's byte order, at the place the layout gives.
  const std::vector<unsigned char> bytes = slurp(path);
  const int64_t pitch = static_cast<int64_t>(kPixels) * size + layout.prefix;
  for (int l = 0; l < kLines; ++l) {
    const size_t line_at = static_cast<size_t>(layout.offset + l * pitch);
    for (int c = 0; c < kPixels; ++c)
      for (int p = 0; p < parts; ++p)
        ASSERT_EQ(decode(bytes, line_at + layout.prefix + c * size + p * ps, type, order), value(type, l, c, p))
            << l << "," << c << "," << p;
    for (int i = 0; i < layout.prefix; ++i) {
      // An even prefix is one item, reversed as a whole in the other byte order.
      const bool reversed = order == 1 && layout.prefix % 2 == 0;
      const int src = reversed ? layout.prefix - 1 - i : i;
      ASSERT_EQ(bytes[line_at + i], prefixes[l * layout.prefix + src]) << "prefix " << l << "," << i;
    }
  }

  DataFile r;
  ASSERT_EQ(r.read_hdr(path), 0);
  EXPECT_EQ(r.pixels, kPixels);
  EXPECT_EQ(r.lines, kLines);
  EXPECT_EQ(r.rowPrefix, layout.prefix);
  EXPECT_EQ(r.headerOffset, layout.offset);
  EXPECT_EQ(r.cellType, type);
  EXPECT_EQ(r.byteOrder, order);
  r.bufferSize = bufferSize;

  // Whole raster, the last columns of lines running over the next line's prefix, single cells.
  const struct {
    int firstColumn, columns, firstLine, lines;
  } windows[] = {{0, kPixels, 0, kLines}, {3, 2, 1, 3}, {0, 1, 2, 2}, {1, 3, 3, 1}, {4, 1, 0, 4}};
  for (const auto& w : windows) {
    SCOPED_TRACE(::testing::Message() << "window " << w.firstColumn << "+" << w.columns << ", " << w.firstLine
                                      << "+" << w.lines);
    const int stride = w.columns + 2;
    std::vector<unsigned char> out(static_cast<size_t>(w.lines * stride * size), 0xEE);
    BufferIO io(&r, w.firstColumn, w.columns, w.firstLine, w.lines, type);
    ASSERT_EQ(io.readbuffer(out.data(), stride), 0);
    for (int l = 0; l < w.lines; ++l) {
      for (int c = 0; c < w.columns; ++c)
        for (int p = 0; p < parts; ++p)
          ASSERT_EQ(decode(out, (l * stride + c) * size + p * ps, type, 0),
                    value(type, w.firstLine + l, w.firstColumn + c, p));
      if (l + 1 < w.lines) {
        EXPECT_EQ(out[(l * stride + w.columns) * size], 0xEE) << "stride gap written";
      }
    }
  }
  if (layout.prefix > 0) {
    std::vector<unsigned char> got(static_cast<size_t>(3 * layout.prefix));
    ASSERT_EQ(BufferIO(&r, 0, kPixels, 1, 3, type).readprefix(got.data()), 0);
    EXPECT_TRUE(std::equal(got.begin(), got.end(), prefixes.begin() + layout.prefix));
  }
}

INSTANTIATE_TEST_SUITE_P(AllTypes, RasterRoundTrip,
                         ::testing::Combine(::testing::Range(0, 8), ::testing::Values(0, 1), ::testing::Range(0, 3),
                                            ::testing::Values(0, 37)),
                         [](const auto& info) {
                           char name[64];
                           std::snprintf(name, sizeof name, "t%d_o%d_l%d_b%d", std::get<0>(info.param),
                                         std::get<1>(info.param), std::get<2>(info.param), std::get<3>(info.param));
                           return std::string(name);
                         });

// ---------------------------------------------------------------------------------- conversions

class Conversion : public sar::io::test::TempDirTest {};

TEST_F(Conversion, ReadAndWriteConvertAsTheTableSays) {
  const double nan = std::nan("");
  const double i32min = std::numeric_limits<int32_t>::min();
  const struct Case {
    const char* what;
    int fileType, memType;
    bool writing;  // false: file -> memory; true: memory -> file
    std::vector<double> from, expect;  // parts, flattened
  } cases[] = {
      {"float to int16 rounds half away and saturates", kFloat32, kInt16, false,
       {2.5, -2.5, 0.49999997, -0.5, 40000, -40000, nan}, {3, -3, 0, -1, 32767, -32768, 0}},
      {"double to int32", kFloat64, kInt32, false, {2.5, -1e12, 1.5}, {3, i32min, 2}},
      {"int32 to int16 is integer assignment", kInt32, kInt16, false, {70000, -1, 32768}, {4464, -1, -32768}},
      {"int16 to int32", kInt16, kInt32, false, {-5, 300}, {-5, 300}},
      {"short complex to float complex", kShortComplex, kFloatComplex, false, {3, -4}, {3, -4}},
      {"short complex to double complex", kShortComplex, kDoubleComplex, false, {3, -4}, {3, -4}},
      {"int pairs to short complex", kIntComplex, kShortComplex, false, {70000, -70000}, {4464, -4464}},
      {"int16 to complex: imaginary 0", kInt16, kFloatComplex, false, {-7}, {-7, 0}},
      {"int32 to double complex", kInt32, kDoubleComplex, false, {123456}, {123456, 0}},
      {"float to double complex", kFloat32, kDoubleComplex, false, {1.25}, {1.25, 0}},
      {"complex to real keeps the real part", kFloatComplex, kFloat32, false, {1.5, 2.5}, {1.5}},
      {"double complex to float complex", kDoubleComplex, kFloatComplex, false, {0.1, 0.2},
       {static_cast<float>(0.1), static_cast<float>(0.2)}},
      {"float to double", kFloat32, kFloat64, false, {0.1}, {static_cast<float>(0.1)}},
      {"int16 to float", kInt16, kFloat32, false, {-32768}, {-32768}},
      {"write float complex as short complex", kShortComplex, kFloatComplex, true,
       {2.5, -2.5, 1e6, -1e6}, {3, -3, 32767, -32768}},
      {"write float as int32", kInt32, kFloat32, true, {-2.5}, {-3}},
      {"write float into complex", kFloatComplex, kFloat32, true, {1.5}, {1.5, 0}},
      {"write complex into float", kFloat32, kFloatComplex, true, {1.5, 2.5}, {1.5}},
      {"write int32 into int16", kInt16, kInt32, true, {70000}, {4464}},
      {"write double into float", kFloat32, kFloat64, true, {0.1}, {static_cast<float>(0.1)}},
  };
  for (const Case& c : cases) {
    for (int order : {0, 1}) {
      SCOPED_TRACE(::testing::Message() << c.what << ", order " << order);
      const std::string path = file("c.raw");
      const int srcType = c.writing ? c.memType : c.fileType;
      const int dstType = c.writing ? c.fileType : c.memType;
      const int cells = static_cast<int>(c.from.size()) / cell_parts(srcType);
      std::vector<unsigned char> src;
      for (size_t i = 0; i < c.from.size(); ++i) {
        encode(src, i * part_size(srcType), srcType, c.writing ? 0 : order, c.from[i]);
      }
      std::vector<unsigned char> dst;
      DataFile f(path);
      f.pixels = cells;
      f.lines = 1;
      f.cellType = c.fileType;
      f.byteOrder = order;
      if (c.writing) {
        ASSERT_EQ(BufferIO(&f, 0, cells, 0, 1, c.memType).writebuffer(src.data()), 0);
        ASSERT_EQ(f.close(), 0);
        dst = slurp(path);
      } else {
        sar::io::test::put_text(path, std::string(src.begin(), src.end()));
        dst.assign(static_cast<size_t>(cells * cell_size(c.memType)), 0xEE);
        ASSERT_EQ(BufferIO(&f, 0, cells, 0, 1, c.memType).readbuffer(dst.data()), 0);
      }
      ASSERT_EQ(dst.size(), c.expect.size() * part_size(dstType));
      for (size_t i = 0; i < c.expect.size(); ++i) {
        EXPECT_EQ(decode(dst, i * part_size(dstType), dstType, c.writing ? order : 0), c.expect[i]) << "part " << i;
      }
    }
  }
}

// ---------------------------------------------------------------------------------- headers

class Headers : public sar::io::test::TempDirTest {
 protected:
  std::string raster(const std::string& name, int bytes = 4096) {
    const std::string path = file(name);
    sar::io::test::put_text(path, std::string(static_cast<size_t>(bytes), '\0'));
    return path;
  }
  static std::string profile(const std::string& lines, const std::string& pixels, const std::string& offset,
                             const std::string& prefix, const std::string& order, const std::string& type) {
    std::string t = "[RasterInfo]\n";
    for (const auto& [k, v] : {std::pair{"NrOfLinesPerImage", lines}, {"NrOfPixelsPerLine", pixels},
                               {"HeaderOffset", offset}, {"RowPrefix", prefix}, {"ByteOrder", order},
                               {"CellType", type}}) {
      if (!v.empty()) t += std::string(k) + " = " + v + "\n";
    }
    return t;
  }
};

TEST_F(Headers, ProfileDialectByNames) {
  const std::string path = raster("p.raw");
  sar::io::test::put_text(path + ".hdr", profile("3", "4", "6000000000", "12", "MSBFirst", "SHORT_COMPLEX"));
  DataFile d;
  ASSERT_EQ(d.read_hdr(path), 0);
  EXPECT_EQ(d.lines, 3);
  EXPECT_EQ(d.pixels, 4);
  EXPECT_EQ(d.headerOffset, 6000000000LL);
  EXPECT_EQ(d.rowPrefix, 12);
  EXPECT_EQ(d.byteOrder, kBigEndian);
  EXPECT_EQ(d.cellType, kShortComplex);

  // Any text but "MSBFirst" is little-endian; every name maps to its code.
  const std::pair<const char*, int> names[] = {{"FLOAT_COMPLEX", 0}, {"FLOAT32", 1}, {"DOUBLE_COMPLEX", 2},
                                               {"FLOAT64", 3},       {"INT32", 5},   {"SHORT_COMPLEX", 6},
                                               {"INT16", 7},         {"INT8_COMPLEX", 8}, {"INT8", 9}};
  for (const auto& [name, code] : names) {
    const std::string p = raster(std::string("n_") + name + ".raw");
    sar::io::test::put_text(p + ".hdr", profile("1", "1", "0", "0", "msbfirst", name));
    DataFile n;
    ASSERT_EQ(n.read_hdr(p), 0) << name;
    EXPECT_EQ(n.cellType, code) << name;
    EXPECT_EQ(n.byteOrder, kLittleEndian);
  }

  // A header already in profile text stays profile text when rewritten.
  d.lines = 2;
  ASSERT_EQ(d.write_hdr(), 0);
  EXPECT_EQ(sar::metadata::header_dialect(path + ".hdr"), sar::metadata::HeaderDialect::kProfile);
  DataFile again;
  ASSERT_EQ(again.read_hdr(path), 0);
  EXPECT_EQ(again.lines, 2);
  EXPECT_EQ(again.byteOrder, kBigEndian);

  // Written as profile text from scratch; code 4 has no name to write.
  DataFile fresh(raster("fresh.raw"));
  fresh.pixels = 2;
  fresh.lines = 2;
  fresh.cellType = kDoubleComplex;
  ASSERT_EQ(fresh.write_hdr_profile(), 0);
  DataFile back;
  ASSERT_EQ(back.read_hdr(fresh.fileName), 0);
  EXPECT_EQ(back.cellType, kDoubleComplex);
  fresh.cellType = kIntComplex;
  fresh.fileName = raster("four.raw");
  EXPECT_EQ(fresh.write_hdr_profile(), 1);
}

TEST_F(Headers, DefectiveHeadersAreRefused) {
  const std::string xmlGood =
      "<OmbrixXmlDoc><NumberOfChannels>1</NumberOfChannels><Description/><Channel Number=\"1\"><RasterInfo>"
      "<NrOfLinesPerImage>2</NrOfLinesPerImage><NrOfPixelsPerLine>2</NrOfPixelsPerLine>"
      "<HeaderOffset>0</HeaderOffset><RowPrefix>0</RowPrefix><ByteOrder>0</ByteOrder><CellType>1</CellType>"
      "</RasterInfo></Channel></OmbrixXmlDoc>";
  auto xmlWith = [&](const std::string& from, const std::string& to) {
    std::string t = xmlGood;
    t.replace(t.find(from), from.size(), to);
    return t;
  };
  const struct {
    const char* what;
    std::string header;  // empty: no header at all
  } cases[] = {
      {"no header", ""},
      {"missing lines", profile("", "2", "0", "0", "LSBFirst", "FLOAT32")},
      {"missing pixels", profile("2", "", "0", "0", "LSBFirst", "FLOAT32")},
      {"missing offset", profile("2", "2", "", "0", "LSBFirst", "FLOAT32")},
      {"missing prefix", profile("2", "2", "0", "", "LSBFirst", "FLOAT32")},
      {"missing order", profile("2", "2", "0", "0", "", "FLOAT32")},
      {"missing type", profile("2", "2", "0", "0", "LSBFirst", "")},
      {"unknown type name", profile("2", "2", "0", "0", "LSBFirst", "COMPLEX_FOO")},
      {"negative pixels", profile("2", "-2", "0", "0", "LSBFirst", "FLOAT32")},
      {"xml missing key", xmlWith("<RowPrefix>0</RowPrefix>", "")},
      {"xml unknown type", xmlWith("<CellType>1</CellType>", "<CellType>12</CellType>")},
      {"xml byte order 2", xmlWith("<ByteOrder>0</ByteOrder>", "<ByteOrder>2</ByteOrder>")},
      {"xml negative lines", xmlWith("<NrOfLinesPerImage>2<", "<NrOfLinesPerImage>-2<")},
      {"xml offset overflow", xmlWith("<HeaderOffset>0<", "<HeaderOffset>99999999999999999999<")},
  };
  int index = 0;
  for (const auto& c : cases) {
    SCOPED_TRACE(c.what);
    const std::string path = raster(sar::io::test::numbered("bad", index++));
    if (!c.header.empty()) sar::io::test::put_text(path + ".hdr", c.header);
    DataFile d;
    EXPECT_EQ(d.read_hdr(path), 1);
    EXPECT_EQ(d.cellType, -1);
    float out[4] = {};
    EXPECT_EQ(BufferIO(&d, 0, 1, 0, 1, kFloat32).readbuffer(out), 1);
    EXPECT_EQ(fs::exists(path + ".hdr"), !c.header.empty()) << "a read created the header";
  }
  // The good form passes, so the table above fails for the defect and nothing else.
  const std::string ok = raster("good.raw");
  sar::io::test::put_text(ok + ".hdr", xmlGood);
  DataFile d;
  EXPECT_EQ(d.read_hdr(ok), 0);
}

TEST_F(Headers, EightBitTypesAreReadButNotWindowed) {
  const std::string path = raster("i8.raw");
  sar::io::test::put_text(path + ".hdr", profile("2", "2", "0", "0", "LSBFirst", "INT8"));
  DataFile d;
  ASSERT_EQ(d.read_hdr(path), 0);
  EXPECT_EQ(d.cellType, kInt8);
  float out[4] = {};
  EXPECT_EQ(BufferIO(&d, 0, 2, 0, 2, kFloat32).readbuffer(out), 1);
  EXPECT_EQ(BufferIO(&d, 0, 2, 0, 2, kInt8).readbuffer(out), 1);
}

// ---------------------------------------------------------------------------------- bad input

class BadInput : public sar::io::test::TempDirTest {};

TEST_F(BadInput, WindowsAndShortRastersFailCleanly) {
  const std::string path = file("b.raw");
  std::vector<float> data(20);
  for (size_t i = 0; i < data.size(); ++i) data[i] = static_cast<float>(i);
  {
    DataFile w(path);
    w.pixels = 5;
    w.lines = 4;
    w.rowPrefix = 4;
    w.cellType = kFloat32;
    ASSERT_EQ(BufferIO(&w, 0, 5, 0, 4, kFloat32).writebuffer(data.data()), 0);
    ASSERT_EQ(w.close(), 0);
    ASSERT_EQ(w.write_hdr(), 0);
  }
  DataFile d;
  ASSERT_EQ(d.read_hdr(path), 0);
  std::vector<float> out(64);
  // A writer may add lines beyond the header's count (rasters grow as they are written), so
  // that case is refused for reading only.
  const struct {
    const char* what;
    int firstColumn, columns, firstLine, lines, memType;
    bool writeRefused;
  } cases[] = {
      {"columns past the line", 4, 2, 0, 1, kFloat32, true}, {"lines past the raster", 0, 5, 3, 2, kFloat32, false},
      {"negative column", -1, 2, 0, 1, kFloat32, true},      {"negative lines", 0, 5, 0, -1, kFloat32, true},
      {"memory type 8", 0, 5, 0, 1, kInt8Complex, true},     {"memory type -1", 0, 5, 0, 1, -1, true},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.what);
    EXPECT_EQ(BufferIO(&d, c.firstColumn, c.columns, c.firstLine, c.lines, c.memType).readbuffer(out.data()), 1);
    DataFile w(file("scratch.raw"));
    w.clone(d);
    w.fileName = file("scratch.raw");
    const int st = BufferIO(&w, c.firstColumn, c.columns, c.firstLine, c.lines, c.memType).writebuffer(out.data());
    EXPECT_EQ(st, c.writeRefused ? 1 : 0);
  }
  BufferIO whole(&d, 0, 5, 0, 4, kFloat32);
  std::vector<std::byte> small(5 * 4 * 4 - 1);
  EXPECT_EQ(whole.readbuffer(std::span<std::byte>(small), 5), 1);  // memory too small
  EXPECT_EQ(whole.readbuffer(out.data(), 4), 1);                   // stride below the width
  ASSERT_EQ(d.close(), 0);

  // Shorter than the header says: the window over the missing part fails, what exists reads.
  fs::resize_file(path, 2 * (5 * 4 + 4) + 4 + 8);
  DataFile s;
  ASSERT_EQ(s.read_hdr(path), 0);
  EXPECT_EQ(BufferIO(&s, 0, 5, 0, 4, kFloat32).readbuffer(out.data()), 1);
  ASSERT_EQ(BufferIO(&s, 0, 2, 2, 1, kFloat32).readbuffer(out.data()), 0);
  EXPECT_EQ(out[0], 10.0f);
  EXPECT_EQ(out[1], 11.0f);
  EXPECT_EQ(s.copy(file("copy.raw"), 16), 1);
}

// ---------------------------------------------------------------------------------- file access

class FileAccess : public sar::io::test::TempDirTest {};

TEST_F(FileAccess, BufferSpanIsExclusiveAndEndOfFileIsQuiet) {
  const std::string path = file("bytes.raw");
  std::string bytes(256, '\0');
  for (int i = 0; i < 256; ++i) bytes[i] = static_cast<char>(i);
  sar::io::test::put_text(path, bytes);
  DataFile d(path);
  d.bufferSize = 16;
  ASSERT_EQ(d.open(0), 0);
  unsigned char b = 0;
  ASSERT_EQ(d.seek(32, 0), 0);  // fills [32, 48)
  ASSERT_EQ(d.read(&b, 1), 0);
  EXPECT_EQ(b, 32);
  sar::io::test::poke(path, 32, std::vector<unsigned char>(16, 0xFF));
  ASSERT_EQ(d.seek(33, 0), 0);  // inside the span: served from the buffer
  ASSERT_EQ(d.read(&b, 1), 0);
  EXPECT_EQ(b, 33);
  ASSERT_EQ(d.seek(-2, 1), 0);  // relative, inside [0, bytes in buffer)
  ASSERT_EQ(d.read(&b, 1), 0);
  EXPECT_EQ(b, 32);
  ASSERT_EQ(d.seek(32, 0), 0);  // exactly the buffer's start: refilled from the file
  ASSERT_EQ(d.read(&b, 1), 0);
  EXPECT_EQ(b, 0xFF);
  unsigned char tail[10] = {};
  ASSERT_EQ(d.seek(250, 0), 0);
  EXPECT_EQ(d.read(tail, 10), 0);
  EXPECT_EQ(d.last_count(), 6);
  EXPECT_EQ(tail[5], 255);
  EXPECT_EQ(d.tell(), 256);
  EXPECT_EQ(d.write(tail, 1), 1);  // read-only access
  EXPECT_EQ(d.open(7), 1);
  EXPECT_FALSE(d.is_open());
}

TEST_F(FileAccess, CopyTakesTheDescribedBytesInChunks) {
  const std::string path = file("src.raw");
  std::string bytes(300, '\0');
  for (size_t i = 0; i < bytes.size(); ++i) bytes[i] = static_cast<char>(i * 7);
  sar::io::test::put_text(path, bytes);
  DataFile d(path);
  d.headerOffset = 10;
  d.pixels = 3;
  d.lines = 9;
  d.rowPrefix = 5;
  d.cellType = kShortComplex;  // 10 + 9 * (12 + 5) = 163 bytes
  ASSERT_EQ(d.copy(file("dst.raw"), 7), 0);
  EXPECT_EQ(sar::io::test::slurp_text(file("dst.raw")), bytes.substr(0, 163));
  EXPECT_EQ(d.copy(file("dst.raw"), 0), 1);
}

TEST_F(FileAccess, RastersBeyondFourGigabytes) {
  // Sparse files: only the written pages take disk space.
  const std::string path = file("big.raw");
  DataFile w(path);
  w.pixels = 1 << 20;
  w.lines = 1100;  // 4 MiB + 4 bytes a line: about 4.3 GiB
  w.rowPrefix = 4;
  w.headerOffset = 100;
  w.cellType = kFloat32;
  w.byteOrder = kBigEndian;
  const float last[3] = {1.5f, -2.5f, 3.5f};
  const int32_t prefix = 0x01020304;
  ASSERT_EQ(BufferIO(&w, w.pixels - 3, 3, 1099, 1, kFloat32).writebuffer(last), 0);
  ASSERT_EQ(BufferIO(&w, 0, 1, 1099, 1, kFloat32).writeprefix(&prefix), 0);
  ASSERT_EQ(w.close(), 0);
  ASSERT_EQ(w.write_hdr(), 0);
  EXPECT_GT(w.line_offset(1099), int64_t{1} << 32);
  EXPECT_EQ(static_cast<int64_t>(fs::file_size(path)), w.raster_bytes());

  DataFile r;
  ASSERT_EQ(r.read_hdr(path), 0);
  r.bufferSize = 1 << 16;
  double got[4] = {};
  ASSERT_EQ(BufferIO(&r, r.pixels - 4, 4, 1099, 1, kFloat64).readbuffer(got), 0);
  EXPECT_EQ(got[0], 0.0);
  EXPECT_EQ(got[1], 1.5);
  EXPECT_EQ(got[3], 3.5);
  int32_t p = 0;
  ASSERT_EQ(BufferIO(&r, 0, 1, 1099, 1, kFloat32).readprefix(&p), 0);
  EXPECT_EQ(p, prefix);
  ASSERT_EQ(r.close(), 0);
  fs::remove(path);

  // A header offset beyond 32 bits survives the header.
  DataFile o(file("offset.raw"));
  o.pixels = 2;
  o.lines = 2;
  o.headerOffset = int64_t{5} << 30;
  o.cellType = kInt16;
  const int16_t v[4] = {1, -2, 3, -4};
  ASSERT_EQ(BufferIO(&o, 0, 2, 0, 2, kInt16).writebuffer(v), 0);
  ASSERT_EQ(o.close(), 0);
  ASSERT_EQ(o.write_hdr(), 0);
  DataFile ro;
  ASSERT_EQ(ro.read_hdr(o.fileName), 0);
  EXPECT_EQ(ro.headerOffset, int64_t{5} << 30);
  int16_t back[4] = {};
  ASSERT_EQ(BufferIO(&ro, 0, 2, 0, 2, kInt16).readbuffer(back), 0);
  EXPECT_EQ(back[3], -4);
}

}  // namespace

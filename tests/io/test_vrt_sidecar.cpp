// The GDAL VRT sidecar of written rasters, checked by reading pixels back with GDAL's own tools.
#include <gtest/gtest.h>

#include <cstdio>
#include <cstdlib>
#include <memory>
#include <sstream>
#include <string>
#include <vector>

#include "io/data_file.hpp"
#include "io/vrt_sidecar.hpp"
#include "io_test_util.hpp"

using namespace sar::io;

namespace {

class VrtSidecar : public sar::io::test::TempDirTest {};

bool gdal_available() { return std::system("command -v gdallocationinfo > /dev/null 2>&1") == 0; }

// Runs gdallocationinfo over "x y" queries and returns one output line per query.
std::vector<std::string> gdal_values(const std::string& vrt, const std::vector<std::pair<int, int>>& at,
                                     const std::string& dir) {
  std::string queries;
  for (const auto& [x, y] : at) queries += std::to_string(x) + " " + std::to_string(y) + "\n";
  const std::string input = dir + "/queries.txt";
  sar::io::test::put_text(input, queries);
  const std::string cmd = "gdallocationinfo -valonly '" + vrt + "' < '" + input + "' 2>&1";
  std::unique_ptr<FILE, int (*)(FILE*)> pipe(popen(cmd.c_str(), "r"), pclose);
  std::vector<std::string> lines;
  if (!pipe) return lines;
  char buf[512];
  while (std::fgets(buf, sizeof buf, pipe.get())) {
    std::string s(buf);
    while (!s.empty() && (s.back() == '\n' || s.back() == '\r')) s.pop_back();
    lines.push_back(s);
  }
  return lines;
}

// "re+imi" (GDAL's form for complex values, "12.5+-3i") or a plain number.
std::pair<double, double> parse_value(const std::string& text) {
  char* end = nullptr;
  const double re = std::strtod(text.c_str(), &end);
  if (*end == '+') {
    char* end2 = nullptr;
    const double im = std::strtod(end + 1, &end2);
    return {re, im};
  }
  return {re, 0.0};
}

TEST_F(VrtSidecar, DescribesTheLayout) {
  RasterLayout l{file("x&y.raw"), 100, 20, 12, 32, kShortComplex, kBigEndian};
  const std::string text = vrt_sidecar_text(l);
  EXPECT_NE(text.find("rasterXSize=\"100\" rasterYSize=\"20\""), std::string::npos);
  EXPECT_NE(text.find("dataType=\"CInt16\""), std::string::npos);
  EXPECT_NE(text.find("<SourceFilename relativeToVRT=\"1\">x&amp;y.raw</SourceFilename>"), std::string::npos);
  EXPECT_NE(text.find("<ImageOffset>44</ImageOffset>"), std::string::npos);  // header + prefix of line 0
  EXPECT_NE(text.find("<PixelOffset>4</PixelOffset>"), std::string::npos);
  EXPECT_NE(text.find("<LineOffset>412</LineOffset>"), std::string::npos);
  EXPECT_NE(text.find("<ByteOrder>MSB</ByteOrder>"), std::string::npos);
  l.cellType = kInt8Complex;
  const std::string two = vrt_sidecar_text(l);
  EXPECT_NE(two.find("band=\"2\""), std::string::npos);
  EXPECT_NE(two.find("<ImageOffset>45</ImageOffset>"), std::string::npos);
  l.cellType = kCellUnset;
  EXPECT_TRUE(vrt_sidecar_text(l).empty());
}

TEST_F(VrtSidecar, GdalReadsTheValuesTheEngineWrote) {
  if (!gdal_available()) GTEST_SKIP() << "GDAL command line tools (gdallocationinfo, Debian gdal-bin) not on PATH";
  const int pixels = 7;
  const int lines = 3;
  const struct {
    int type;
    int order;
  } cases[] = {{kFloatComplex, kLittleEndian}, {kFloatComplex, kBigEndian}, {kInt16, kLittleEndian},
               {kInt16, kBigEndian},           {kShortComplex, kBigEndian}, {kFloat64, kBigEndian}};
  for (const auto& c : cases) {
    SCOPED_TRACE(::testing::Message() << "type " << c.type << " order " << c.order);
    const std::string path = file(sar::io::test::numbered("g", c.type, c.order));
    std::vector<dcomplex> values(static_cast<size_t>(pixels * lines));
    for (int i = 0; i < pixels * lines; ++i) values[i] = {i * 3.0 - 20.0, 100.0 - i * 5.0};
    DataFile w(path);
    w.pixels = pixels;
    w.lines = lines;
    w.rowPrefix = 12;
    w.headerOffset = 32;
    w.cellType = c.type;
    w.byteOrder = c.order;
    std::vector<unsigned char> prefix(static_cast<size_t>(12 * lines), 0x7F);
    ASSERT_EQ(BufferIO(&w, 0, pixels, 0, lines, kDoubleComplex).writebuffer(values.data()), 0);
    ASSERT_EQ(BufferIO(&w, 0, pixels, 0, lines, kDoubleComplex).writeprefix(prefix.data()), 0);
    ASSERT_EQ(w.close(), 0);
    ASSERT_EQ(w.write_hdr(), 0);

    const std::vector<std::pair<int, int>> at = {{0, 0}, {6, 0}, {0, 1}, {3, 2}, {6, 2}};
    const std::vector<std::string> out = gdal_values(vrt_sidecar_path(path), at, dir_.string());
    ASSERT_EQ(out.size(), at.size()) << (out.empty() ? std::string() : out.front());
    for (size_t k = 0; k < at.size(); ++k) {
      const dcomplex v = values[static_cast<size_t>(at[k].second * pixels + at[k].first)];
      const auto [re, im] = parse_value(out[k]);
      EXPECT_EQ(re, v.real()) << out[k];
      EXPECT_EQ(im, cell_is_complex(c.type) ? v.imag() : 0.0) << out[k];
    }
  }
}

}  // namespace

// XML header documents (and their profile-text dialect): the typed readers by channel and path,
// and the polynomial sets that size themselves from counts in the header.
#include <array>

#include "base/errors.hpp"
#include "fuzz_support.hpp"
#include "metadata/ombrixxml.hpp"
#include "metadata/poly_sar.hpp"

using namespace sar::metadata;

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  const std::string path = sar::fuzz::input_file(data, size, "header.hdr");
  try {
    ombrixxml doc;
    if (doc.initXmlFile(path) == XmlOpenResult::kOk) {
      std::string text;
      int32_t channels = 0;
      doc.readDescription(text);
      doc.readNumberOfChannels(channels);
      std::array<int32_t, 3> i32{};
      std::array<int64_t, 2> i64{};
      std::array<float, 2> f{};
      std::array<double, 9> d{};
      std::array<std::string, 2> s;
      for (int channel = 1; channel <= 2; ++channel) {
        doc.readInt(channel, "RasterInfo/CellType", i32);
        doc.readInt64(channel, "RasterInfo/NumberOfLines", i64);
        doc.readFloat(channel, "RasterInfo/Dummy", f);
        doc.readDouble(channel, "PolySAR/DCpoly-0/Coefficients", d);
        doc.readString(channel, "RasterInfo/FileName", s);
      }
    }
    polySAR polys;
    if (polys.readhdr(path) == 0) {
      double out = 0.0;
      polys.EvaluateDCinterp(1000.0, 0.5, out);
      polys.EvaluateFRinterp(1000.0, 0.5, out);
      polys.EvaluateSL2GR(1000.0, 0.5, out);
    }
  } catch (const sar::base::CErrorExceptionManager&) {
  }
  return 0;
}

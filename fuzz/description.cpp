// Description files: the key tables and both dialects of a description, "<base>.sml" (XML) and
// "<base>_hdr" (profile text). The first byte picks the dialect and whether the input is read as a
// key table instead.
#include "base/errors.hpp"
#include "base/profile.hpp"
#include "fuzz_support.hpp"
#include "io/description.hpp"

using namespace sar::io;

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  if (size == 0) return 0;
  const int pick = data[0] % 3;
  ++data;
  --size;
  if (pick == 2) {
    std::vector<FieldDecl> fields;
    std::string error;
    parse_key_text(sar::fuzz::as_text(data, size), fields, &error);
    return 0;
  }
  const std::string base = (sar::fuzz::scratch_dir() / "product").string();
  std::error_code err;
  std::filesystem::remove(base + ".sml", err);
  std::filesystem::remove(base + "_hdr", err);
  sar::fuzz::input_file(data, size, pick == 0 ? "product.sml" : "product_hdr");
  sar::base::FreeProfile();
  try {
    CSectionDataGroup group{"RasterInfo", "RegistrationCoordinates", "DEMCoordinates", "ChannelInfo", "PolarimetricCalibrationParameters"};
    if (group.read(base, 0) == 0) {
      int64_t n = 0;
      double v = 0.0;
      std::string s;
      group.getInteger("RasterInfo.NrOfLinesPerImage", n);
      group.getString("RasterInfo.OtherInfo", s, 3);
      group.getDouble("ChannelInfo.PRF", v, 1);
      group.getDouble("PolarimetricCalibrationParameters.CalibrationMatrix", v, 5);
      group.write(base + "_copy", 0, 1);
    }
  } catch (const sar::base::CErrorExceptionManager&) {
  }
  sar::base::FreeProfile();
  return 0;
}

// Raster headers "<raster>.hdr" in both dialects, and a read of the raster they describe: the
// sizes come from the header and must be checked against the file before anything is sized.
#include <vector>

#include "base/errors.hpp"
#include "base/profile.hpp"
#include "fuzz_support.hpp"
#include "io/data_file.hpp"
#include "io/raster_header.hpp"

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  const std::string raster = (sar::fuzz::scratch_dir() / "raster").string();
  sar::fuzz::input_file(data, size, "raster.hdr");
  // A small raster behind the header: whatever the header claims, only these bytes exist.
  static const bool made = [&] {
    const std::vector<std::uint8_t> cells(4096, 0x3f);
    sar::fuzz::input_file(cells.data(), cells.size(), "raster");
    return true;
  }();
  (void)made;
  sar::base::FreeProfile();
  try {
    sar::io::RasterHeader h;
    if (sar::io::read_raster_header_profile(raster + ".hdr", h) == 0) (void)sar::io::raster_bytes_of(h);
    sar::io::DataFile file(raster);
    if (file.read_hdr(raster) == 0 && file.open(0) == 0) {
      std::vector<std::uint8_t> line(8192);
      file.seek(file.headerOffset, 0);
      file.read(line.data(), static_cast<int64_t>(line.size()));
      file.close();
    }
  } catch (const sar::base::CErrorExceptionManager&) {
  }
  sar::base::FreeProfile();
  return 0;
}

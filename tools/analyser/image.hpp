#pragma once
// Complex rasters for the analyser: their layout (from the <raster>.hdr beside them, or given),
// windows read into memory as complex floats, and mean power profiles.
#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "analyser/irf.hpp"
#include "io/cell_types.hpp"
#include "io/data_file.hpp"

namespace sar::analyser {

struct RasterLayout {
  std::int32_t lines = 0;
  std::int32_t samples = 0;
  std::int64_t header_offset = 0;
  std::int32_t row_prefix = 0;
  std::int32_t cell_type = io::kFloatComplex;
  std::int32_t byte_order = io::kLittleEndian;
};

/// Layout fields given on a command line; unset ones come from the header or the file size.
struct LayoutOverrides {
  std::optional<std::int32_t> lines, samples, row_prefix, cell_type, byte_order;
  std::optional<std::int64_t> header_offset;
  bool any_size() const { return lines.has_value() || samples.has_value(); }
};

/// The layout of a raster: from <raster>.hdr unless the overrides give a size; fields the
/// overrides give replace the header's; a missing line or sample count follows from the file
/// size. Throws std::runtime_error with a message for a missing or unreadable header, a size
/// that cannot be derived, a file shorter than the layout, or a cell type that is not complex.
RasterLayout resolve_layout(const std::string& raster, const LayoutOverrides& given);

/// Samples of a window of an image, owned, row-major.
struct ComplexImage {
  std::vector<fcomplex> data;
  int lines = 0;
  int samples = 0;
  int first_line = 0;
  int first_sample = 0;
  ComplexImageView view() const {
    return {data, lines, samples, samples, first_line, first_sample};
  }
};

/// Mean power of every column (range profile) and of every line (azimuth profile).
struct PowerProfiles {
  std::vector<double> range;    ///< one value per sample index
  std::vector<double> azimuth;  ///< one value per line
};

/// Profiles of an image window held in memory.
PowerProfiles power_profiles(const ComplexImageView& image);

/// A raster opened for reading windows; every cell type is read as complex floats.
class RasterReader {
 public:
  /// Throws std::runtime_error when the file cannot be opened.
  RasterReader(const std::string& path, const RasterLayout& layout);
  const RasterLayout& layout() const { return layout_; }
  /// The window clipped to the raster (possibly empty). Throws on a read failure.
  ComplexImage read(int first_line, int lines, int first_sample, int samples);
  /// Profiles of the whole raster, read `block_lines` lines at a time.
  PowerProfiles power_profiles(int block_lines = 256);

 private:
  RasterLayout layout_;
  io::DataFile file_;
};

}  // namespace sar::analyser

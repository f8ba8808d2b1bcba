#pragma once
// The multilooked image of a focused stripmap SLC, as a step after the job: the detected
// raster with its raster header, GDAL sidecar, annotation (R_hdr) and description (R.sml).
#include <string>

namespace sar::jobs {

struct StripLooksChoice {
  int azimuth = 0;  // 0 and 0: the looks the SLC's annotation suggests
  int range = 0;
  bool groundRange = false;
  double groundStep = 0.0;  // m; 0: the mean ground step of the looked slant cells
};

/// Parses "AZxRG" (whole numbers from 1 to 64) or "auto" (the suggested looks). Empty, or the
/// reason the text is refused.
std::string parse_looks(const std::string& text, StripLooksChoice& choice);

/// The text that parse_looks reads back into the same looks.
std::string looks_text(const StripLooksChoice& choice);

/// Name of the multilooked product of a product stem: stem + "_gr" (ground range) or "_pwr".
std::string looked_product_name(const std::string& stem, bool groundRange);

/// Multilooks the SLC `slc` (with "<slc>.hdr" and "<slc>_hdr") into `output`, then converts
/// its annotation into the description. Empty, or the error text.
std::string multilook_slc(const std::string& slc, const std::string& output, const StripLooksChoice& choice);

}  // namespace sar::jobs

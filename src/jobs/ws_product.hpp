#pragma once
// The last step shared by the two wide swath jobs (level 0 WS and level 1 WSS): once the
// multilooker has written the joined image, its corners, annotation and description, and the
// quick-look GeoTIFF.
#include <array>
#include <string>

#include "hostlib/quicklook.hpp"
#include "multilook/strip_multilook.hpp"
#include "multilook/ws_multilook.hpp"

namespace sar::jobs {

struct WsProductInfo {
  std::string origin;        // "ORIGIN DATA" of the description
  std::string polarisation;  // "H/H", ...
  double azimuthSpacing = 0.0;  // m between lines; 0: from the corners' ground distance
  double farTime = 0.0;         // two-way s of the last column of the far sub-swath
  bool quickLook = false;
  double quickLookScale = 1.0;
};

/// Section "mlookConfiguration" (every key mandatory) and the burst selection of "mlookInput" of
/// parameters_multilook.hdr. Returns DeleteTempFile (0 when absent). A missing key or an antenna
/// correction asked for ends the run.
int read_ws_multilook_config(const std::string& parameterFile, multilook::WsMultilookConfig& cfg);

/// Near and far of the first and last lines, and the centre (latitude, longitude); a corner that
/// cannot be located stays at 0, 0.
std::array<hostlib::GeoCorner, 5> ws_corners(const multilook::WsMultilookResult& res, const multilook::SlcGrid& orbit,
                                             double farTime);

/// Great-circle distance (m) between two corners on a sphere of the Earth's mean radius.
double ground_distance(const hostlib::GeoCorner& a, const hostlib::GeoCorner& b);

/// Annotation `output`_hdr, its conversion to `output`.hdr/.sml and the quick-look when asked.
/// A failed annotation removes the image and ends the run (130560, "WSwritepars_kelvor()"); a
/// failed quick-look ends it with the GeoTIFF detail.
void finish_ws_product(const std::string& output, const multilook::WsMultilookResult& res,
                       const multilook::SlcGrid& orbit, bool ground, WsProductInfo info);

}  // namespace sar::jobs

#pragma once
// What the footprint and quick-look writers share around GDAL: one registration of the drivers,
// owners for its handles, and errors kept for our own messages instead of printed on stderr.
#include <memory>
#include <string>

#include <cpl_error.h>
#include <gdal.h>
#include <ogr_api.h>
#include <ogr_srs_api.h>

namespace sar::hostlib::gdal {

/// Registers GDAL's drivers once per process.
inline void register_drivers() {
  static const bool registered = [] {
    GDALAllRegister();
    return true;
  }();
  (void)registered;
}

struct DatasetClose {
  void operator()(void* d) const { GDALClose(d); }
};
struct SrsRelease {
  void operator()(void* s) const { OSRRelease(s); }
};
struct FeatureDestroy {
  void operator()(void* f) const { OGR_F_Destroy(f); }
};
struct FieldDestroy {
  void operator()(void* f) const { OGR_Fld_Destroy(f); }
};
struct StyleTableDestroy {
  void operator()(void* t) const { OGR_STBL_Destroy(t); }
};

using Dataset = std::unique_ptr<void, DatasetClose>;
using Srs = std::unique_ptr<void, SrsRelease>;

/// While alive, GDAL's messages on this thread are not printed; the last one stays readable
/// through CPLGetLastErrorMsg for the caller's own report.
class QuietErrors {
 public:
  QuietErrors() {
    CPLPushErrorHandler(CPLQuietErrorHandler);
    CPLErrorReset();
  }
  ~QuietErrors() { CPLPopErrorHandler(); }
  QuietErrors(const QuietErrors&) = delete;
  QuietErrors& operator=(const QuietErrors&) = delete;
};

/// `what`, followed by GDAL's last message when it has one.
inline std::string error_text(const std::string& what) {
  const char* message = CPLGetLastErrorMsg();
  return what + (message && *message ? std::string(": ") + message : std::string());
}

/// WGS84 geographic coordinates with longitude first, as GIS files store them.
inline Srs wgs84() {
  Srs srs(OSRNewSpatialReference(nullptr));
  if (srs && OSRSetWellKnownGeogCS(srs.get(), "WGS84") == OGRERR_NONE) {
    OSRSetAxisMappingStrategy(srs.get(), OAMS_TRADITIONAL_GIS_ORDER);
    return srs;
  }
  return nullptr;
}

}  // namespace sar::hostlib::gdal

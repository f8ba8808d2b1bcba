#pragma once
// Footprint companions of a product: where on the ground the scene lies, in three forms that
// common tools open without help.
//
//   <product>.kml                    KML 2.2 Placemark, Polygon of the four corners (lon,lat,0),
//                                    counter-clockwise, name = product, TimeStamp = acquisition
//   <product>.shp .shx .dbf .prj     ESRI shapefile, one Polygon record (outer ring clockwise),
//                                    dBase III attributes NAME, SENSOR, ACQ_TIME, LINES, PIXELS,
//                                    CENTER_LAT, CENTER_LON; WGS84 geographic coordinates
//   <product>.xml                    SceneFootprint document: the four corners and the centre as
//                                    ground control points with image line/pixel and lat/lon
//
// Everything comes from the product's description (<product>.sml, else <product>_hdr):
// RasterInfo.NrOfLinesPerImage, RasterInfo.NrOfPixelsPerLine and the OtherInfo table, whose first
// row names the entries "CORNER POINT n  X"/"Y" (X longitude, Y latitude, degrees),
// "CENTER SCENE POINT X"/"Y" and "ACQUISITION_TIME", and whose second row holds their values.
// Corner 1 is near range / first line, 2 far range / first line, 3 near range / last line,
// 4 far range / last line. Image positions count from the leading edge of the first line and
// sample: corner 4 sits at (lines, pixels), the centre at (lines / 2, pixels / 2).
//
// A scene across the antimeridian keeps a continuous ring in the shapefile (longitudes carried
// past +-180 from corner 1), while the KML and the XML keep every longitude within -180..180.
#include <array>
#include <cstdint>
#include <string>

namespace sar::hostlib {

/// Flag of write_footprint: every companion.
inline constexpr int kFootprintAllFiles = 1;
/// Status of a refused request: unknown flag, missing or incomplete description.
inline constexpr int kFootprintRejected = 10;
/// Status of a companion that could not be written (nothing of the new set is left then).
inline constexpr int kFootprintWriteFailed = 1;

struct FootprintPoint {
  double latitude = 0.0;   // degrees, -90..90
  double longitude = 0.0;  // degrees, -180..180
  double line = 0.0;       // image position, see above
  double pixel = 0.0;
};

struct Footprint {
  std::string productName;      // file name of the product
  std::string sensorName;       // Sensor.SensorName, may be empty
  std::string acquisitionTime;  // "dd-MMM-yyyy hh:mm:ss.uuuuuu" as annotated, may be empty
  int64_t lines = 0;
  int64_t pixels = 0;
  /// Corners 1 to 4 in that order (near/early, far/early, near/late, far/late).
  std::array<FootprintPoint, 4> corners{};
  FootprintPoint centre{};
};

/// Reads the footprint of the product `slcPath` (a "_hdr" or ".sml" suffix is taken off) from
/// its description. 0, or kFootprintRejected with `error` telling what is missing or wrong.
int read_footprint(const std::string& slcPath, Footprint& footprint, std::string& error);

/// Reads the finished description of `slcPath` and, with flag kFootprintAllFiles, writes the
/// .xml, .kml, .shp/.shx/.dbf/.prj companions beside it, replacing older ones. Each file is
/// written under a temporary name and renamed only when all of them are complete. 0, or
/// kFootprintRejected / kFootprintWriteFailed with a warning report; never throws.
int write_footprint(const std::string& slcPath, int flag);

}  // namespace sar::hostlib

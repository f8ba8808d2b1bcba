#pragma once
// The annotation of a focused stripmap product.
//
// At the end of a job, what it knows about the product goes into the profile file
// R_slc_hdr (sections OrbitCorrection, StateVectorData, InitialGeometry, Processing,
// ChannelInfo, RasterInfo, Sensor, RegistrationCoordinates, SwathInfo), which is then converted
// into the description R_slc.sml; the SLC raster also gets its header R_slc.hdr.
//
// The annotation describes the SLC grid: its first line and sample are those of the focused
// image (after the block overlaps), its sizes the focused sizes, and its times come from
// procparm's first line and first sample times. Doppler polynomials are written as range
// polynomials at the first line time. The pass direction follows the sign of the satellite's
// Earth-fixed z velocity at the scene centre.
#include <string>
#include <string_view>

#include "jobs/stages.hpp"

namespace sar::jobs {

/// Suggested looks for a square ground pixel: rangeGround = pixelSpacingRg / sin(incidence),
/// azimuthGround = pixelSpacingAz / sin(fixedAngle) (degrees, magnitudes); only the finer
/// direction is multilooked, by the truncated ratio. Returns 0.
int ComputeSuggestedLooks(double pixelSpacingRg, double pixelSpacingAz, double incidence, double fixedAngle,
                          int& rangeLooks, int& azimuthLooks, double& rangeGroundSpace, double& azimuthGroundSpace);

/// UTM zone of a longitude in degrees (brought into -180..180 by one turn at most); the
/// antimeridian itself belongs to zone 60. 0 for a longitude that is not a number.
int utm_zone(double longitude);

/// "H/H", "V/V", "H/V", "V/H" by sarpar's code; "" for another code.
std::string_view polarisation_text(int code);

/// True when the satellite moves north (Earth-fixed z velocity above 0) at `time` (sec85),
/// from procparm's five state vectors.
bool pass_is_ascending(const procparm& proc, double time);

/// The literals that tell the stripmap products apart.
struct AnnotationProduct {
  std::string_view originData = "ENVISAT_IM0";
  std::string_view sceneDataPrefix = "ENVISAT-1|ENVISAT_IM0|";
  bool writePrfExtracted = true;
  std::string_view sensorName = "ENVISAT-1";
  /// Swath text; empty: "IS<n>|" from sarpar's swath number.
  std::string_view swath = {};
  /// ENVISAT's calibration constant and elevation pattern table in ChannelInfo.
  bool writeEnvisatCalibration = true;
  /// Fewest azimuth looks to suggest: alternating polarisation images carry grating lobes a
  /// few lines off every response, which only enough looks average away.
  int minimumAzimuthLooks = 1;
  /// Report an older annotation that cannot be removed ("Cannot remove file", level 1).
  bool reportOldHeaderRemoval = false;
};

/// Writes the raster header of the SLC (slcPath + ".hdr") for the focused grid of `proc`.
/// 0, or non-zero when it cannot be written.
int write_slc_raster_header(const std::string& slcPath, const procparm& proc);

/// Writes the profile annotation `headerPath` (an older file there is replaced) and syncs it.
/// 0, or 1 when the file cannot be written.
int write_stripmap_annotation(const std::string& headerPath, const sarpar& par, const procparm& proc,
                              const azimuthconf& az, const AnnotationProduct& product = {});

/// Converts the annotation into the description beside it (base of headerPath + ".sml"),
/// replacing an older description. 0, or 1 (missing key table, unreadable annotation, failed
/// write).
int convert_annotation(const std::string& headerPath);

/// The annotation of one focused stripmap image: the profile annotation `headerPath`, the
/// raster header of the SLC (headerPath without "_hdr", + ".hdr") and the description. 0, or
/// non-zero with a report and `stage` noted as the failed stage.
int write_stripmap_product(const std::string& headerPath, const sarpar& par, const procparm& proc,
                           const azimuthconf& az, const AnnotationProduct& product, const std::string& stage);

/// The product annotation of the IM job: the profile annotation, the raster header of the SLC
/// (headerPath without "_hdr", + ".hdr") and the description. 0, or 1 with a report.
int IMwritepars(const std::string& headerPath, const sarpar& par, const procparm& proc, const dcestconf& dc,
                const azimuthconf& az, const extconf& extra, const enviauxfiles& files);

/// The product annotation of the RADARSAT job: the focused image's description "<slcPath>.hdr"
/// read back with GSread (traced), its grid, rates, pulse, orbit block and polynomials written
/// as the stripmap annotation `headerPath` with RADARSAT-1's literals, then the description.
/// What the description does not carry (corners, angles, spacings) comes from the focuser's
/// records. 0, or 1 with a report when the description is missing or lacks a record.
int RSMwritepars(const std::string& headerPath, const std::string& slcPath, const sarpar& par, const procparm& proc,
                 const azimuthconf& az);

}  // namespace sar::jobs

// The joined wide swath image's annotation, description and quick-look, for both wide swath jobs.
#include "jobs/ws_product.hpp"

#include <bit>
#include <cerrno>
#include <cmath>
#include <complex>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <span>
#include <vector>

#include "base/convert.hpp"
#include "base/diagnostics.hpp"
#include "base/errors.hpp"
#include "base/profile.hpp"
#include "base/run_services.hpp"
#include "geometry/geolocation.hpp"
#include "hostlib/footprint.hpp"
#include "jobs/annotation.hpp"
#include "jobs/job_common.hpp"
#include "jobs/stages.hpp"
#include "base/constants.hpp"

namespace sar::jobs {

namespace {

constexpr double kCarrier = 5.331e9;
constexpr double kLightSpeed = base::kSpeedOfLight;

std::string time_text(double sec85) {
  std::string text;
  if (base::sec852myascii(sec85, text) != 0) return {};
  return text;
}

/// The ground point of a two-way slant time at an azimuth time; false when it cannot be found.
bool locate(const multilook::SlcGrid& orbit, double azimuthTime, double tau, hostlib::GeoCorner& at) {
  geometry::grpt_rec rec;
  for (std::size_t k = 0; k < 5; ++k)
    rec.state_vectors[k] = {orbit.positions[3 * k], orbit.positions[3 * k + 1], orbit.positions[3 * k + 2]};
  rec.t0 = orbit.orbitFirstTime;
  rec.dt = orbit.orbitStep;
  rec.azimuth_time = azimuthTime;
  rec.tau = tau;
  rec.wavelength = kLightSpeed / kCarrier;
  if (geometry::gr_pt_lat_lon(rec) != 0) return false;
  at = {rec.latitude, rec.longitude};
  return true;
}

/// The annotation of the multilooked image (profile text R_hdr), for the description.
int WSwritepars_kelvor(const std::string& headerPath, const WsProductInfo& info,
                       const multilook::WsMultilookResult& res, const multilook::SlcGrid& orbit, bool ground,
                       const std::array<hostlib::GeoCorner, 5>& corners) {
  using namespace sar::base;
  const std::string& f = headerPath;
  std::error_code ec;
  std::filesystem::remove(f, ec);
  FreeProfile(f);
  const double last = res.firstLineTime + res.lines * res.lineStep;
  const std::string first = time_text(res.firstLineTime);
  const char* p = "Processing";
  WriteMyProfileInt(p, "NAzimuthLooks", 1, f);
  WriteMyProfileInt(p, "NRangeLooks", res.rangeLooks, f);
  const std::array<double, 3> slant{res.nearTime * 149896229.0,
                                    (res.nearTime + 0.5 * res.samples * res.slantStep) * 149896229.0,
                                    (res.nearTime + res.samples * res.slantStep) * 149896229.0};
  if (!ground) WriteProfileDoubleArray(p, "SlantRange", slant, f);
  if (ground) WriteProfileDoubleArray(p, "GroundRangeSlantTimeCoeff", res.groundSlantTime, f);
  WriteMyProfileDouble(p, "PixelSpacingRg", res.rangeSpacing, f);
  WriteMyProfileDouble(p, "PixelSpacingAz", info.azimuthSpacing, f);
  WriteMyProfileDouble(p, "AzimuthTimeStep", res.lineStep, f);
  WriteProfileDoubleArray(p, "FastTime", {&res.nearTime, 1}, f);
  WriteMyProfileStringQuote(p, "AzimuthStartTime", first, f);
  WriteMyProfileStringQuote(p, "AzimuthStopTime", time_text(last), f);
  const char* c = "ChannelInfo";
  const double prf = 1.0 / res.lineStep, fs = res.decimation / res.slantStep;
  WriteProfileDoubleArray(c, "CarrierFrequency", {&kCarrier, 1}, f);
  WriteProfileDoubleArray(c, "PRF", {&prf, 1}, f);
  WriteProfileDoubleArray(c, "SamplingRate", {&fs, 1}, f);
  const std::string pol = info.polarisation;
  WriteMyProfileStringArray(c, "Description", {&pol, 1}, f);
  WriteMyProfileStringQuote("StateVectorData", "StateVectorSource", "ORBIT_PRODUCT", f);
  WriteMyProfileStringQuote("StateVectorData", "StateVectorReference", "ECR", f);
  WriteMyProfileInt("StateVectorData", "nStateVectors", 5, f);
  WriteMyProfileStringQuote("StateVectorData", "TimeFirst", time_text(orbit.orbitFirstTime), f);
  WriteMyProfileDouble("StateVectorData", "TimeDelta", orbit.orbitStep, f);
  WriteMyProfileDoubleMatrix("StateVectorData", "pos", orbit.positions, 5, 3, f);
  WriteMyProfileDoubleMatrix("StateVectorData", "vel", orbit.velocities, 5, 3, f);
  WriteMyProfileStringQuote("InitialGeometry", "Projection", ground ? "GROUND_RANGE" : "SLANT_RANGE", f);
  WriteMyProfileStringQuote("InitialGeometry", "TimeDirectionPixel", "INCREASE TIME DIRECTION", f);
  WriteMyProfileStringQuote("InitialGeometry", "TimeDirectionLines", "INCREASE TIME DIRECTION", f);
  const char* r = "RasterInfo";
  WriteMyProfileInt(r, "HeaderOffset", 0, f);
  WriteMyProfileInt(r, "RowPrefix", 0, f);
  WriteMyProfileInt(r, "RowSuffix", 0, f);
  WriteMyProfileStringQuote(r, "CellType", "FLOAT32", f);
  WriteMyProfileStringQuote(r, "DataUnits", "AMPLITUDE", f);
  WriteMyProfileDouble(r, "NullCellValue", 0.0, f);
  WriteMyProfileInt(r, "NrOfPixelsPerLine", res.samples, f);
  WriteMyProfileInt(r, "NrOfLinesPerImage", res.lines, f);
  WriteMyProfileStringQuote(r, "BytesOrder", std::endian::native == std::endian::big ? "MSBF" : "LSBF", f);
  auto coordinate = [](double v) {
    char text[32];
    std::snprintf(text, sizeof text, "%.6f", v);
    return std::string(text);
  };
  const std::array<std::string, 16> names{
      "ORIGIN DATA",       "UTM_HEMISPHERE",    "UTM_ZONE",          "CORNER POINT 3  X",    "CORNER POINT 3  Y",
      "CORNER POINT 4  X", "CORNER POINT 4  Y", "CORNER POINT 2  X", "CORNER POINT 2  Y",    "CORNER POINT 1  X",
      "CORNER POINT 1  Y", "CENTER SCENE POINT X", "CENTER SCENE POINT Y", "SOFTWARE", "ACQUISITION_TIME",
      "SCENE DATA"};
  const auto& centre = corners[4];
  const std::array<std::string, 16> values{info.origin,
                                           centre.latitude >= 0.0 ? "NORTH" : "SOUTH",
                                           std::to_string(utm_zone(centre.longitude)),
                                           coordinate(corners[2].longitude),
                                           coordinate(corners[2].latitude),
                                           coordinate(corners[3].longitude),
                                           coordinate(corners[3].latitude),
                                           coordinate(corners[1].longitude),
                                           coordinate(corners[1].latitude),
                                           coordinate(corners[0].longitude),
                                           coordinate(corners[0].latitude),
                                           coordinate(centre.longitude),
                                           coordinate(centre.latitude),
                                           "WSProcessor v1.1",
                                           first,
                                           "ENVISAT-1|WideSwath MULTILOOKING IMAGE|" + first.substr(0, 11) + "|" + pol +
                                               (ground ? "|GROUND_RANGE" : "|SLANT_RANGE")};
  std::vector<std::string> otherInfo(names.begin(), names.end());
  otherInfo.insert(otherInfo.end(), values.begin(), values.end());
  WriteMyProfileStringMatrix(r, "OtherInfo", otherInfo, 2, 16, f);
  WriteMyProfileStringQuote("Sensor", "SensorName", "ENVISAT-1", f);
  WriteMyProfileDouble("RegistrationCoordinates", "LatNorthing", centre.latitude, f);
  WriteMyProfileDouble("RegistrationCoordinates", "LonEasting", centre.longitude, f);
  WriteMyProfileString("SwathInfo", "Swath", "WS|", f);
  const int st = SyncProfile(f);
  FreeProfile(f);
  return st == 0 ? 0 : 1;
}

}  // namespace

int read_ws_multilook_config(const std::string& parameterFile, multilook::WsMultilookConfig& cfg) {
  const std::string s = "mlookConfiguration";
  cfg.groundRange = base::GetCheckMyProfileInt(s, "Sl2Gr", parameterFile);
  cfg.groundStep = base::GetCheckMyProfileInt(s, "GrSamplingStep", parameterFile);
  cfg.groundResolution = base::GetCheckMyProfileInt(s, "GrResolution", parameterFile);
  cfg.w1 = base::GetCheckMyProfileDouble(s, "W1", parameterFile);
  cfg.w2 = base::GetCheckMyProfileDouble(s, "W2", parameterFile);
  const int antenna = base::GetCheckMyProfileInt(s, "RgAnt_flag", parameterFile);
  int32_t value[1] = {0};
  if (base::GetMyProfileIntArray("mlookInput", "BurstsToSkip", value, parameterFile) == base::kProfileOk)
    cfg.burstsToSkip = value[0];
  if (base::GetMyProfileIntArray("mlookInput", "BurstsToProcess", value, parameterFile) == base::kProfileOk)
    cfg.burstsToProcess = value[0];
  if (antenna != 0) {
    // The elevation pattern correction of the sub-swaths is not part of this build.
    base::report(base::kReportError, "RgAnt_flag 1: the range antenna pattern correction is not available");
    note_failed_stage("mlook_conf::checkpar");
    base::fatal(base::ec::kStageFailed, {"mlook_conf::checkpar()", "RgAnt_flag"});
  }
  int deleteTemporary = 0;
  if (base::GetMyProfileIntArray(s, "DeleteTempFile", value, parameterFile) == base::kProfileOk)
    deleteTemporary = value[0];
  errno = 0;
  return deleteTemporary;
}

std::array<hostlib::GeoCorner, 5> ws_corners(const multilook::WsMultilookResult& res, const multilook::SlcGrid& orbit,
                                             double farTime) {
  std::array<hostlib::GeoCorner, 5> corners{};
  const double tEnd = res.firstLineTime + (res.lines - 1) * res.lineStep;
  const double at[5][2] = {{res.firstLineTime, res.nearTime}, {res.firstLineTime, farTime}, {tEnd, res.nearTime},
                           {tEnd, farTime}, {0.5 * (res.firstLineTime + tEnd), 0.5 * (res.nearTime + farTime)}};
  for (std::size_t i = 0; i < 5; ++i) locate(orbit, at[i][0], at[i][1], corners[i]);
  errno = 0;
  return corners;
}

double ground_distance(const hostlib::GeoCorner& a, const hostlib::GeoCorner& b) {
  constexpr double kRadius = 6371008.8, kDeg = base::kDegree;
  const double dlat = (b.latitude - a.latitude) * kDeg, dlon = (b.longitude - a.longitude) * kDeg;
  const double h = std::sin(0.5 * dlat) * std::sin(0.5 * dlat) +
                   std::cos(a.latitude * kDeg) * std::cos(b.latitude * kDeg) * std::sin(0.5 * dlon) * std::sin(0.5 * dlon);
  return 2.0 * kRadius * std::asin(std::min(1.0, std::sqrt(h)));
}

void finish_ws_product(const std::string& output, const multilook::WsMultilookResult& res,
                       const multilook::SlcGrid& orbit, bool ground, WsProductInfo info) {
  const std::array<hostlib::GeoCorner, 5> corners = ws_corners(res, orbit, info.farTime);
  if (!(info.azimuthSpacing > 0.0) && res.lines > 1)
    info.azimuthSpacing = ground_distance(corners[0], corners[2]) / (res.lines - 1);

  const std::string headerPath = output + "_hdr";
  if (WSwritepars_kelvor(headerPath, info, res, orbit, ground, corners) != 0 || convert_annotation(headerPath) != 0) {
    for (const char* suffix : {"", ".hdr", ".vrt", "_hdr", ".sml"}) base::DeleteProductFile(output + suffix, false);
    note_failed_stage("WSwritepars_kelvor");
    base::fatal(base::ec::kStageFailed, {"WSwritepars_kelvor()", failed_stage()});
  }
  // Where the swath lies, for map tools, from the corners of the description; an image without
  // it is still a product, so a failure is reported and the job goes on.
  hostlib::write_footprint(output, hostlib::kFootprintAllFiles);
  errno = 0;

  if (!info.quickLook) return;
  base::SetActivityLabel("Tiff generation ...");
  hostlib::QuickLookRequest request;
  // Sizes one to one: the quick-look of a multilooked image keeps its size.
  request.maxWidth = res.samples;
  request.maxHeight = res.lines;
  request.scale = info.quickLookScale > 0.0 ? info.quickLookScale : 1.0;
  request.rangeSpacing = res.rangeSpacing;
  request.azimuthSpacing = info.azimuthSpacing > 0.0 ? info.azimuthSpacing : 1.0;
  for (std::size_t i = 0; i < 4; ++i) request.corners[i] = corners[i];
  std::FILE* in = std::fopen(output.c_str(), "rb");
  std::vector<float> amplitude(static_cast<std::size_t>(res.samples));
  auto source = [&](int line, std::span<std::complex<float>> row) {
    if (!in || fseeko(in, static_cast<off_t>(line) * res.samples * 4, SEEK_SET) != 0 ||
        std::fread(amplitude.data(), 4, amplitude.size(), in) != amplitude.size())
      return false;
    for (std::size_t i = 0; i < row.size() && i < amplitude.size(); ++i) row[i] = amplitude[i];
    return true;
  };
  const int st = hostlib::write_quicklook_geotiff(output + ".tif", res.lines, res.samples, source, request);
  if (in) std::fclose(in);
  errno = 0;
  if (st != 0) base::fatal(base::ec::kStageFailed, {"GeoTIFF", output + ".tif"});
}

}  // namespace sar::jobs

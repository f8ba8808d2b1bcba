// The level 1 wide swath multilook job: an ASA_WSS_1P product's five sub-swaths of focused
// bursts, read in place, multilooked and joined into one detected image R_pwr (slant range) or
// R_gr (ground range, argument 6 "OK"), with its annotation, description and quick-look.
#include <bit>
#include <cerrno>
#include <cmath>
#include <complex>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <span>

#include "base/convert.hpp"
#include "base/diagnostics.hpp"
#include "base/errors.hpp"
#include "base/profile.hpp"
#include "base/run_services.hpp"
#include "envisat/level1.hpp"
#include "envisat/product_types.hpp"
#include "geometry/geolocation.hpp"
#include "hostlib/quicklook.hpp"
#include "jobs/annotation.hpp"
#include "jobs/aux_lookup.hpp"
#include "jobs/drivers.hpp"
#include "jobs/job_common.hpp"
#include "jobs/stages.hpp"
#include "multilook/wss_input.hpp"
#include "multilook/ws_multilook.hpp"

namespace sar::jobs {

namespace {

constexpr const char* kWssParameterFile = "parameters_multilook.hdr";
constexpr double kCarrier = 5.331e9;
constexpr double kLightSpeed = 299792458.0;

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
int WSwritepars_kelvor(const std::string& headerPath, const envisat::Level1Product& product,
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
  WriteMyProfileDouble(p, "PixelSpacingAz", product.azimuthSpacing, f);
  WriteMyProfileDouble(p, "AzimuthTimeStep", res.lineStep, f);
  WriteProfileDoubleArray(p, "FastTime", {&res.nearTime, 1}, f);
  WriteMyProfileStringQuote(p, "AzimuthStartTime", first, f);
  WriteMyProfileStringQuote(p, "AzimuthStopTime", time_text(last), f);
  const char* c = "ChannelInfo";
  const double prf = 1.0 / res.lineStep, fs = res.decimation / res.slantStep;
  WriteProfileDoubleArray(c, "CarrierFrequency", {&kCarrier, 1}, f);
  WriteProfileDoubleArray(c, "PRF", {&prf, 1}, f);
  WriteProfileDoubleArray(c, "SamplingRate", {&fs, 1}, f);
  const std::string pol = product.polarisation1;
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
  const std::array<std::string, 16> values{"ENVISAT_WSS",
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

int main_multilook_wss(const std::string& listPath) {
  const std::vector<std::string> args = start_job(listPath, "Multilooking ASA WSS",
                                                  "\nINPUT ASA_RS : [ %s ]\nOUTPUT ROOT NAME : [ %s ]\nINPUT DORIS : [ %s ]",
                                                  {0, 1, 2});
  const std::string desDir = description_dir();
  const std::string parameterFile = desDir + kWssParameterFile;

  if (args[0] == kNotOK) base::fatal(base::ec::kBadArguments, {"ASA_WSS"});
  require_existing(args[0]);
  if (!envisat::EnvisatTypes(args[0]).is_wss()) base::fatal(base::ec::kBadArguments, {"ASA_WSS"});
  if (args[1] == kNotOK) base::fatal(base::ec::kBadArguments, {"OUTPUT ROOT NAME"});

  std::string xca, ins;
  if (find_aux(args[0], desDir, "ASA_XCA", xca) == 0) base::LogPrintf("ASA_XCA from the auxiliary index: %s\n", xca.c_str());
  if (find_aux(args[0], desDir, "ASA_INS", ins) != 0) {
    note_failed_stage("findaux");
    base::fatal(base::ec::kStageFailed, {"findaux()"});
  }
  base::LogPrintf("ASA_INS from the auxiliary index: %s\n", ins.c_str());

  if (args[2] == kNotOK) base::fatal(base::ec::kBadArguments, {"DOR_VOR"});
  require_existing(args[2]);
  {
    const envisat::EnvisatTypes orbit(args[2]);
    if (!orbit.is_dorvor() && !orbit.is_dorpor()) base::fatal(base::ec::kBadArguments, {"DOR_VOR"});
  }

  // The product's sub-swaths, read in place.
  envisat::Level1Product product;
  std::array<multilook::WsSubSwath, 5> swaths;
  std::string error;
  base::SetActivityLabel("Reading ASA WSS ...");
  if (envisat::read_level1(args[0], product, error) != 0 || multilook::wss_sub_swaths(product, swaths, error) != 0) {
    base::report(base::kReportError, error);
    note_failed_stage("images::run");
    base::fatal(base::ec::kStageFailed, {"images::run()", error});
  }
  base::LogPrintf("There are %d SWATH (MDS)\n", static_cast<int>(product.measurements().size()));

  // Parameters: every key of the configuration is mandatory.
  const std::string s = "mlookConfiguration";
  multilook::WsMultilookConfig cfg;
  cfg.groundRange = base::GetCheckMyProfileInt(s, "Sl2Gr", parameterFile);
  cfg.groundStep = base::GetCheckMyProfileInt(s, "GrSamplingStep", parameterFile);
  cfg.groundResolution = base::GetCheckMyProfileInt(s, "GrResolution", parameterFile);
  cfg.w1 = base::GetCheckMyProfileDouble(s, "W1", parameterFile);
  cfg.w2 = base::GetCheckMyProfileDouble(s, "W2", parameterFile);
  const int antenna = base::GetCheckMyProfileInt(s, "RgAnt_flag", parameterFile);
  int32_t bursts[1] = {0};
  if (base::GetMyProfileIntArray("mlookInput", "BurstsToSkip", bursts, parameterFile) == base::kProfileOk)
    cfg.burstsToSkip = bursts[0];
  if (base::GetMyProfileIntArray("mlookInput", "BurstsToProcess", bursts, parameterFile) == base::kProfileOk)
    cfg.burstsToProcess = bursts[0];
  if (antenna != 0) {
    // The elevation pattern correction of the sub-swaths is not part of this build.
    base::report(base::kReportError, "RgAnt_flag 1: the range antenna pattern correction is not available");
    note_failed_stage("mlook_conf::checkpar");
    base::fatal(base::ec::kStageFailed, {"mlook_conf::checkpar()", "RgAnt_flag"});
  }
  const bool ground = args[6] == "OK";
  if (ground) cfg.groundRange = 1;
  cfg.lineStep = product.lineTimeInterval;
  cfg.samplingRate = kLightSpeed / (2.0 * product.rangeSpacing);
  const std::string output = args[1] + (cfg.groundRange ? "_gr" : "_pwr");
  {
    const base::ErrnoGuard keep;
    std::error_code made;
    std::filesystem::create_directories(std::filesystem::path(output).parent_path(), made);
  }

  multilook::SlcGrid orbit;
  if (multilook::orbit_geometry(args[2], 0.5 * (product.firstLineTime + product.lastLineTime), kCarrier, orbit,
                                error) != 0) {
    base::report(base::kReportError, error);
    note_failed_stage("mlook::run");
    base::fatal(base::ec::kStageFailed, {"mlook::run()", error});
  }
  multilook::WsMultilookResult res;
  base::SetActivityLabel("WS Multilooking ...");
  if (multilook::run_ws_multilook(swaths, cfg, orbit, output, res) != 0) {
    note_failed_stage("mlook::run");
    base::fatal(base::ec::kStageFailed, {"mlook::run()", res.error});
  }
  base::LogPrintf("Samples: %d, Lines: %d\n", res.samples, res.lines);

  // Corners: near and far of the first and last lines, and the centre.
  std::array<hostlib::GeoCorner, 5> corners{};
  const double tEnd = res.firstLineTime + (res.lines - 1) * res.lineStep;
  const double farTime = swaths[4].nearTime + swaths[4].samples * (res.slantStep / res.decimation);
  const double at[5][2] = {{res.firstLineTime, res.nearTime}, {res.firstLineTime, farTime}, {tEnd, res.nearTime},
                           {tEnd, farTime}, {0.5 * (res.firstLineTime + tEnd), 0.5 * (res.nearTime + farTime)}};
  for (std::size_t i = 0; i < 5; ++i) locate(orbit, at[i][0], at[i][1], corners[i]);
  errno = 0;

  const std::string headerPath = output + "_hdr";
  if (WSwritepars_kelvor(headerPath, product, res, orbit, cfg.groundRange != 0, corners) != 0 ||
      convert_annotation(headerPath) != 0) {
    for (const char* suffix : {"", ".hdr", ".vrt", "_hdr", ".sml"}) base::DeleteProductFile(output + suffix, false);
    note_failed_stage("WSwritepars_kelvor");
    base::fatal(base::ec::kStageFailed, {"WSwritepars_kelvor()", failed_stage()});
  }

  if (args[12] == "OK") {
    base::SetActivityLabel("Tiff generation ...");
    hostlib::QuickLookRequest request;
    // Sizes one to one: the quick-look of a multilooked image keeps its size.
    request.maxWidth = res.samples;
    request.maxHeight = res.lines;
    request.scale = std::atof(args[13].c_str()) > 0.0 ? std::atof(args[13].c_str()) : 1.0;
    request.rangeSpacing = res.rangeSpacing;
    request.azimuthSpacing = product.azimuthSpacing > 0.0 ? product.azimuthSpacing : 1.0;
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
  return 0;
}

}  // namespace sar::jobs

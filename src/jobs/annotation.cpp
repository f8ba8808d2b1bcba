#include "jobs/annotation.hpp"

#include <algorithm>
#include <array>
#include <bit>
#include <cmath>
#include <cstdio>
#include <filesystem>
#include <system_error>
#include <vector>

#include "base/convert.hpp"
#include "base/diagnostics.hpp"
#include "base/profile.hpp"
#include "io/cell_types.hpp"
#include "io/data_file.hpp"
#include "io/description.hpp"

namespace sar::jobs {

namespace {

constexpr double kHalfLightSpeed = 149896229.0;
constexpr double kDegree = 0.017453292519943295;
constexpr double kCalConstProc = 60277386404.1413;
constexpr double kFixedLookAngle = 90.0;
constexpr int kHeadingAscending = 344;
constexpr int kHeadingDescending = 195;
/// Pattern gains at or below zero are written at this floor (dB) instead of minus infinity.
constexpr double kPatternFloorDb = -300.0;
constexpr std::size_t kOtherInfoText = 128;

/// The 20 sections of a stripmap description, in the order of the call.
constexpr std::string_view kDescriptionSections[] = {"EnvisatDescriptionRecord",
                                                     "EnvisatFixHeader",
                                                     "user_defined_section",
                                                     "CartographicSystem",
                                                     "RegistrationCoordinates",
                                                     "DEMCoordinates",
                                                     "orbit_information",
                                                     "sar_processing",
                                                     "interferometric_processing",
                                                     "PolarimetricCalibrationParameters",
                                                     "Sensor",
                                                     "RasterInfo",
                                                     "ChannelInfo",
                                                     "Processing",
                                                     "InitialGeometry",
                                                     "StateVectorData",
                                                     "StateVectorCalc",
                                                     "OrbitCorrection",
                                                     "Baseline",
                                                     "GCPRasterInfo"};

std::string time_text(double sec85) {
  std::string text;
  if (base::sec852myascii(sec85, text) != 0) return {};
  return text;
}

std::string printed(const char* format, int value) {
  char text[kOtherInfoText];
  std::snprintf(text, sizeof text, format, value);
  return text;
}

std::string coordinate(double value) {
  char text[kOtherInfoText];
  std::snprintf(text, sizeof text, "%.6f", value);
  return text;
}

/// Strings of the OtherInfo table are held in 128-byte buffers.
std::string bounded(std::string text) {
  if (text.size() > kOtherInfoText - 1) text.resize(kOtherInfoText - 1);
  return text;
}

bool all_zero(const stripmap::DopplerPoly& p) {
  return std::all_of(p.begin(), p.end(), [](double v) { return v == 0.0; });
}

/// The copy azimuth focusing leaves for the product, or the working polynomial when focusing
/// did not leave one.
const stripmap::DopplerPoly& product_poly(const stripmap::DopplerPoly& output, const stripmap::DopplerPoly& working) {
  return all_zero(output) ? working : output;
}

/// The range polynomial of a Doppler polynomial at azimuth time t: a0 + a2 dt, a1 + a3 dt, a4.
std::array<double, 3> range_coefficients(const stripmap::DopplerPoly& a, double t) {
  const double dt = t - a[8];
  return {a[0] + a[2] * dt, a[1] + a[3] * dt, a[4]};
}

/// The shift azimuth focusing applied, in lines. A configured shift below the line count is used
/// as it is (in seconds); a larger one asked for the geometric shift, which shows in where the
/// first focused line landed against the raw first line and the overlap.
double azimuth_pixel_shift(const sarpar& par, const procparm& proc, const azimuthconf& az) {
  if (std::fabs(az.azimuthShift) < par.lines) return az.azimuthShift * par.prf;
  return (proc.firstLineTime - par.azimuthStartTime) * par.prf - (proc.focusedLead > 0 ? proc.focusedLead : az.AzimuthOverlap);
}

/// The five state vectors' Earth-fixed z velocity at `time`, Lagrange through the nodes.
double z_velocity(const procparm& proc, double time) {
  constexpr int n = 5;
  if (!(proc.orbitSpacing > 0.0)) return proc.orbitVelocities[3 * 2 + 2];
  const double s = (time - proc.orbitStartTime) / proc.orbitSpacing;
  double sum = 0.0;
  for (int k = 0; k < n; ++k) {
    double w = 1.0;
    for (int m = 0; m < n; ++m) {
      if (m != k) w *= (s - m) / static_cast<double>(k - m);
    }
    sum += w * proc.orbitVelocities[static_cast<std::size_t>(3 * k + 2)];
  }
  return sum;
}

void remove_quietly(const std::string& path) {
  std::error_code ec;
  std::filesystem::remove(path, ec);
}

int write_raster_header(const std::string& slcPath, const procparm& proc) {
  io::DataFile slc(slcPath);
  slc.lines = proc.focusedLines;
  slc.pixels = proc.focusedSamples;
  slc.cellType = io::kFloatComplex;
  slc.headerOffset = 0;
  slc.rowPrefix = 0;
  return slc.write_hdr();
}

}  // namespace

int ComputeSuggestedLooks(double pixelSpacingRg, double pixelSpacingAz, double incidence, double fixedAngle,
                          int& rangeLooks, int& azimuthLooks, double& rangeGroundSpace, double& azimuthGroundSpace) {
  const double rangeGround = std::fabs(pixelSpacingRg / std::sin(incidence * kDegree));
  const double azimuthGround = std::fabs(pixelSpacingAz / std::sin(fixedAngle * kDegree));
  const auto ratio = [](double a, double b) {
    const double r = a / b;
    // A ratio that is no finite count (zero or missing spacing) asks for no multilooking.
    return std::isfinite(r) && r >= 1.0 && r < 2147483647.0 ? static_cast<int>(r) : 1;
  };
  if (azimuthGround < rangeGround) {
    rangeLooks = 1;
    azimuthLooks = ratio(rangeGround, azimuthGround);
  } else {
    azimuthLooks = 1;
    rangeLooks = ratio(azimuthGround, rangeGround);
  }
  rangeGroundSpace = rangeLooks * rangeGround;
  azimuthGroundSpace = azimuthLooks * azimuthGround;
  return 0;
}

int utm_zone(double longitude) {
  if (!std::isfinite(longitude)) return 0;
  double l = longitude;
  if (l > 180.0) l -= 360.0;
  if (l < -180.0) l += 360.0;
  const int zone = 1 - static_cast<int>((l + 180.0) * -0.16666666666666666);
  return std::clamp(zone, 1, 60);
}

std::string_view polarisation_text(int code) {
  switch (code) {
    case 0:
      return "H/H";
    case 1:
      return "V/V";
    case 2:
      return "H/V";
    case 3:
      return "V/H";
    default:
      return "";
  }
}

bool pass_is_ascending(const procparm& proc, double time) { return z_velocity(proc, time) > 0.0; }

int write_stripmap_annotation(const std::string& headerPath, const sarpar& par, const procparm& proc,
                              const azimuthconf& az, const AnnotationProduct& product) {
  using namespace sar::base;
  const std::string& f = headerPath;
  if (product.reportOldHeaderRemoval) {
    std::error_code ec;
    if (std::filesystem::exists(f, ec) && !std::filesystem::remove(f, ec))
      base::report(base::kReportWarning, "Cannot remove file");
  } else {
    remove_quietly(f);
  }
  FreeProfile(f);

  const double prf = par.prf;
  const double fs = par.samplingRate;
  const double firstLine = proc.firstLineTime;
  const double nearTime = proc.firstSampleTime;
  const int lines = proc.focusedLines;
  const int samples = proc.focusedSamples;
  const double centreTime = firstLine + 0.5 * lines / prf;
  const bool ascending = pass_is_ascending(proc, centreTime);
  const char* direction = ascending ? "ASCENDING" : "DESCENDING";
  const std::string firstLineText = time_text(firstLine);
  const std::string_view pol = polarisation_text(par.polarization_type);
  const auto& centre = proc.corners[4];

  // OrbitCorrection
  const double pixelShift = azimuth_pixel_shift(par, proc, az);
  WriteProfileDoubleArray("OrbitCorrection", "AzimuthPixelShift", {&pixelShift, 1}, f);

  // StateVectorData
  {
    const char* s = "StateVectorData";
    WriteMyProfileStringQuote(s, "StateVectorSource", "SLC_DATA_PRODUCT", f);
    WriteMyProfileStringQuote(s, "StateVectorReference", "ECR", f);
    WriteMyProfileInt(s, "nStateVectors", 5, f);
    WriteMyProfileStringQuote(s, "TimeFirst", time_text(proc.orbitStartTime), f);
    WriteMyProfileDouble(s, "TimeDelta", proc.orbitSpacing, f);
    WriteMyProfileDoubleMatrix(s, "pos", proc.orbitPositions, 5, 3, f);
    WriteMyProfileDoubleMatrix(s, "vel", proc.orbitVelocities, 5, 3, f);
  }

  // InitialGeometry
  {
    const char* s = "InitialGeometry";
    WriteMyProfileStringQuote(s, "Projection", "SLANT_RANGE", f);
    WriteMyProfileInt(s, "SceneHeading", ascending ? kHeadingAscending : kHeadingDescending, f);
    WriteMyProfileStringQuote(s, "TimeDirectionPixel", "INCREASE TIME DIRECTION", f);
    WriteMyProfileStringQuote(s, "TimeDirectionLines", "INCREASE TIME DIRECTION", f);
    WriteMyProfileStringQuote(s, "OrbitConfiguration", direction, f);
    WriteMyProfileInt(s, "ReferenceHeight", 0, f);
  }

  // Processing
  int rangeLooks = 1;
  int azimuthLooks = 1;
  double rangeGroundSpace = 0.0;
  double azimuthGroundSpace = 0.0;
  ComputeSuggestedLooks(proc.rangePixelSpacing, proc.azimuthPixelSpacing, proc.centreIncidence, kFixedLookAngle,
                        rangeLooks, azimuthLooks, rangeGroundSpace, azimuthGroundSpace);
  if (azimuthLooks < product.minimumAzimuthLooks) {
    // The product's azimuth spectrum asks for more looks than square pixels would.
    azimuthGroundSpace *= static_cast<double>(product.minimumAzimuthLooks) / azimuthLooks;
    azimuthLooks = product.minimumAzimuthLooks;
  }
  const stripmap::DopplerPoly& centroid = product_poly(proc.outputCentroid, proc.dopplerCentroid);
  const stripmap::DopplerPoly& rate = product_poly(proc.outputRate, proc.dopplerRate);
  const int32_t nCoeff = 3;
  {
    const char* s = "Processing";
    WriteMyProfileInt(s, "NAzimuthLooks", 1, f);
    WriteMyProfileInt(s, "NRangeLooks", 1, f);
    const std::array<double, 3> slantRange{nearTime * kHalfLightSpeed,
                                           (nearTime + (samples / 2) / fs) * kHalfLightSpeed,
                                           (nearTime + samples / fs) * kHalfLightSpeed};
    WriteProfileDoubleArray(s, "SlantRange", slantRange, f);
    WriteMyProfileDouble(s, "PixelSpacingRg", proc.rangePixelSpacing, f);
    WriteMyProfileDouble(s, "PixelSpacingAz", proc.azimuthPixelSpacing, f);
    WriteMyProfileDouble(s, "AzimuthTimeStep", 1.0 / prf, f);
    WriteProfileDoubleArray(s, "FastTime", {&nearTime, 1}, f);
    WriteMyProfileStringQuote(s, "AzimuthStartTime", firstLineText, f);
    WriteMyProfileStringQuote(s, "AzimuthStopTime", time_text(firstLine + lines / prf), f);
    WriteMyProfileInt(s, "nDopCenDataSet", 1, f);
    WriteMyProfileStringArray(s, "DopCenRefTime", {&firstLineText, 1}, f);
    WriteProfileDoubleArray(s, "DopCenRgRefTime", {&centroid[7], 1}, f);
    WriteMyProfileIntArray(s, "DopCenPol_nCoeff", {&nCoeff, 1}, f);
    WriteProfileDoubleArray(s, "DopCenRangeCoeff", range_coefficients(centroid, firstLine), f);
    WriteProfileDoubleArray(s, "ProcessingVelocity", {&proc.equivalentVelocity, 1}, f);
    WriteMyProfileInt(s, "FromInImageAzimuthLooks", 1, f);
    WriteMyProfileInt(s, "FromInImageRangeLooks", 1, f);
    WriteMyProfileInt(s, "SuggestedAzimuthLooks", azimuthLooks, f);
    WriteMyProfileInt(s, "SuggestedRangeLooks", rangeLooks, f);
    WriteMyProfileDouble(s, "AzimuthGroundPixelSpaceFromSuggestLooks", azimuthGroundSpace, f);
    WriteMyProfileDouble(s, "RangeGroundPixelSpaceFromSuggestLooks", rangeGroundSpace, f);
  }

  // ChannelInfo
  {
    const char* s = "ChannelInfo";
    WriteProfileDoubleArray(s, "CarrierFrequency", {&par.carrierFrequency, 1}, f);
    WriteProfileDoubleArray(s, "BandWidth", {&par.chirp_bandwidth, 1}, f);
    WriteProfileDoubleArray(s, "PRF", {&par.prf, 1}, f);
    if (product.writePrfExtracted) WriteProfileDoubleArray(s, "PRFExtracted", {&par.prf, 1}, f);
    WriteProfileDoubleArray(s, "PulseDuration", {&par.pulse_length, 1}, f);
    WriteProfileDoubleArray(s, "SamplingRate", {&par.samplingRate, 1}, f);
    const std::string description(pol);
    WriteMyProfileStringArray(s, "Description", {&description, 1}, f);
    if (product.writeEnvisatCalibration) WriteMyProfileDouble(s, "CalConstProc", kCalConstProc, f);
    WriteMyProfileDouble(s, "RangeLookAngle", proc.centreLook, f);
    WriteMyProfileDouble(s, "IncidenceAngle", proc.centreIncidence, f);
    if (product.writeEnvisatCalibration) {
      WriteMyProfileDouble(s, "EnvisatReferenceElevationAngle", proc.patternCentre, f);
      std::vector<double> table;
      table.reserve(proc.pattern.size());
      for (float v : proc.pattern)
        table.push_back(v > 0.0f ? 20.0 * std::log10(static_cast<double>(v)) : kPatternFloorDb);
      WriteMyProfileInt(s, "EnvisatTwoWayAntennaElevationPatternTableNbr", static_cast<int32_t>(table.size()), f);
      WriteProfileDoubleArray(s, "EnvisatTwoWayAntennaElevationPatternTable", table, f);
    }
  }

  // RasterInfo
  {
    const char* s = "RasterInfo";
    WriteMyProfileInt(s, "HeaderOffset", 0, f);
    WriteMyProfileInt(s, "RowPrefix", 0, f);
    WriteMyProfileInt(s, "RowSuffix", 0, f);
    WriteMyProfileStringQuote(s, "CellType", "FLOAT_COMPLEX", f);
    WriteMyProfileStringQuote(s, "DataUnits", "SLC", f);
    WriteMyProfileDouble(s, "NullCellValue", 0.0, f);
    WriteMyProfileInt(s, "NrOfPixelsPerLine", samples, f);
    WriteMyProfileInt(s, "NrOfLinesPerImage", lines, f);
    WriteMyProfileStringQuote(s, "BytesOrder", std::endian::native == std::endian::big ? "MSBF" : "LSBF", f);

    const auto& nearEarly = proc.corners[0];
    const auto& farEarly = proc.corners[1];
    const auto& nearLate = proc.corners[2];
    const auto& farLate = proc.corners[3];
    std::string sceneData(product.sceneDataPrefix);
    const std::string swath = product.swath.empty() ? printed("IS%d|", par.swath_number) : std::string(product.swath) + "|";
    sceneData += swath;
    sceneData += firstLineText.substr(0, 11);
    sceneData += '|';
    sceneData += pol;
    sceneData += '|';
    sceneData += direction;
    sceneData += "|SLANT_RANGE";
    const std::array<std::string, 16> names{
        "ORIGIN DATA",          "UTM_HEMISPHERE",    "UTM_ZONE",          "CORNER POINT 3  X",
        "CORNER POINT 3  Y",    "CORNER POINT 4  X", "CORNER POINT 4  Y", "CORNER POINT 2  X",
        "CORNER POINT 2  Y",    "CORNER POINT 1  X", "CORNER POINT 1  Y", "CENTER SCENE POINT X",
        "CENTER SCENE POINT Y", "SOFTWARE",          "ACQUISITION_TIME",  "SCENE DATA"};
    const std::array<std::string, 16> values{std::string(product.originData),
                                             centre.latitude >= 0.0 ? "NORTH" : "SOUTH",
                                             printed("%i", utm_zone(centre.longitude)),
                                             coordinate(nearLate.longitude),
                                             coordinate(nearLate.latitude),
                                             coordinate(farLate.longitude),
                                             coordinate(farLate.latitude),
                                             coordinate(farEarly.longitude),
                                             coordinate(farEarly.latitude),
                                             coordinate(nearEarly.longitude),
                                             coordinate(nearEarly.latitude),
                                             coordinate(centre.longitude),
                                             coordinate(centre.latitude),
                                             "WSfocuser v1.0",
                                             firstLineText,
                                             sceneData};
    std::vector<std::string> otherInfo;
    otherInfo.reserve(32);
    for (const auto& n : names) otherInfo.push_back(bounded(n));
    for (const auto& v : values) otherInfo.push_back(bounded(v));
    WriteMyProfileStringMatrix(s, "OtherInfo", otherInfo, 2, 16, f);
  }

  WriteMyProfileStringQuote("Sensor", "SensorName", product.sensorName, f);
  WriteMyProfileDouble("RegistrationCoordinates", "LatNorthing", centre.latitude, f);
  WriteMyProfileDouble("RegistrationCoordinates", "LonEasting", centre.longitude, f);
  WriteMyProfileString("SwathInfo", "Swath",
                       product.swath.empty() ? printed("IS%d|", par.swath_number) : std::string(product.swath) + "|", f);

  // The Doppler rate closes the Processing section.
  {
    const char* s = "Processing";
    WriteMyProfileStringArray(s, "DopRateRefTime", {&firstLineText, 1}, f);
    WriteProfileDoubleArray(s, "DopRateRgRefTime", {&rate[7], 1}, f);
    WriteMyProfileIntArray(s, "DopRatePol_nCoeff", {&nCoeff, 1}, f);
    WriteProfileDoubleArray(s, "DopRateRangeCoeff", range_coefficients(rate, firstLine), f);
  }

  if (SyncProfile(f) != 0) {
    report(kReportWarning, "Cannot write the annotation " + f);
    return 1;
  }
  return 0;
}

int convert_annotation(const std::string& headerPath) {
  // A description left by an earlier run into the same root would win over the new annotation
  // at reading and lend it stale sections at writing.
  const std::string description = io::description_base(headerPath) + ".sml";
  remove_quietly(description);
  std::vector<std::string> names(std::begin(kDescriptionSections), std::end(kDescriptionSections));
  io::CSectionDataGroup group{std::span<const std::string>(names)};
  if (!group.ok()) {
    base::report(base::kReportWarning, "Cannot set up the product description: " + group.error());
    return 1;
  }
  if (group.read(headerPath, 1) != 0) {
    base::report(base::kReportWarning, "Cannot read the annotation " + headerPath);
    return 1;
  }
  if (group.write(headerPath, 0, 1) != 0) return 1;
  return 0;
}

int write_slc_raster_header(const std::string& slcPath, const procparm& proc) {
  return write_raster_header(slcPath, proc);
}

int write_stripmap_product(const std::string& headerPath, const sarpar& par, const procparm& proc,
                           const azimuthconf& az, const AnnotationProduct& product, const std::string& stage) {
  base::Frame frame(stage.c_str());
  if (headerPath.empty() || !(par.prf > 0.0) || !(par.samplingRate > 0.0)) {
    note_failed_stage(stage);
    return kStageRejected;
  }
  int status = write_stripmap_annotation(headerPath, par, proc, az, product);
  if (status == 0) {
    const std::string slcPath = io::description_base(headerPath);
    if (write_raster_header(slcPath, proc) != 0) {
      base::report(base::kReportWarning, "Cannot write the raster header of " + slcPath);
      status = 1;
    }
  }
  if (status == 0) status = convert_annotation(headerPath);
  if (status != 0) note_failed_stage(stage);
  return frame.check(status);
}

int IMwritepars(const std::string& headerPath, const sarpar& par, const procparm& proc, const dcestconf& /*dc*/,
                const azimuthconf& az, const extconf& /*extra*/, const enviauxfiles& /*files*/) {
  return write_stripmap_product(headerPath, par, proc, az, AnnotationProduct{}, "IMwritepars");
}

}  // namespace sar::jobs

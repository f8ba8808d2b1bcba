#include "sarfocuser/sarfocuser.hpp"

#include <algorithm>
#include <chrono>
#include <cmath>
#include <filesystem>
#include <span>

#include "base/constants.hpp"
#include "base/diagnostics.hpp"
#include "base/profile.hpp"
#include "base/run_services.hpp"
#include "base/stage_clock.hpp"
#include "doppler/dcest.hpp"
#include "geometry/orbit_interp.hpp"
#include "stripmap/azimuth_focus.hpp"
#include "stripmap/coords.hpp"
#include "stripmap/geopoly.hpp"
#include "stripmap/progress.hpp"
#include "stripmap/range_focus.hpp"

namespace sar::sarfocuser {
namespace {

using base::kSpeedOfLight;
constexpr double kEarthRotation = 7.292115189334571e-05;
constexpr double kWgs84A = 6378137.0, kWgs84B = 6356752.314245;
constexpr double kAntennaLength = 15.0;
// The orbit block reaches this far beyond the raw lines: with a centroid of several PRFs the
// zero-Doppler times of the imaged targets lie seconds away from their echoes.
constexpr double kOrbitMargin = 10.0;

int getInt(const char* section, const char* key, const std::string& file) {
  return base::GetCheckMyProfileInt(section, key, file);
}
double getDouble(const char* section, const char* key, const std::string& file) {
  return base::GetCheckMyProfileDouble(section, key, file);
}

using base::StageClock;

bool exists(const std::string& path) {
  const base::ErrnoGuard keep;
  std::error_code ec;
  return std::filesystem::is_regular_file(path, ec);
}

void remove_quietly(const std::string& path) {
  const base::ErrnoGuard keep;
  std::error_code ec;
  if (!std::filesystem::remove(path, ec)) base::report(base::kReportWarning, "Cannot remove file");
}

double earth_radius_below(const geometry::Vec3& s) {
  const double r = geometry::norm(s);
  const double sinLat = s[2] / r, cosLat = std::sqrt(std::max(0.0, 1.0 - sinLat * sinLat));
  return kWgs84A * kWgs84B / std::hypot(kWgs84B * cosLat, kWgs84A * sinLat);
}

}  // namespace

double unsteered_centroid(const geometry::OrbitData& orbit, double t, double tau, double wavelength) {
  using geometry::operator*;
  using geometry::operator+;
  using geometry::operator-;
  const geometry::StateVector sv = geometry::orbit_state_at(orbit, t);
  const geometry::Vec3& s = sv.position;
  const geometry::Vec3 inertial = sv.velocity + geometry::Vec3{-kEarthRotation * s[1], kEarthRotation * s[0], 0.0};
  const geometry::Vec3 along = geometry::unit(inertial);
  const geometry::Vec3 up = geometry::unit(geometry::unit(s) - geometry::dot(geometry::unit(s), along) * along);
  const geometry::Vec3 right = geometry::cross(along, up);
  const double range = 0.5 * kSpeedOfLight * tau, rs = geometry::norm(s), re = earth_radius_below(s);
  const double cosLook = std::clamp((rs * rs + range * range - re * re) / (2.0 * rs * range), -1.0, 1.0);
  const geometry::Vec3 look = -cosLook * up + std::sqrt(1.0 - cosLook * cosLook) * right;
  return 2.0 / wavelength * geometry::dot(look, sv.velocity);
}

int SARFocuser_conf::readconf(const std::string& f) {
  base::Frame frame("SARFocuser_conf::readconf");
  const char* sfc = "sarfocuserConfiguration";
  Incore = getInt(sfc, "Incore", f);
  Memory = getInt(sfc, "Memory", f);
  Verbose = getInt(sfc, "Verbose", f);
  ReportLevel = getInt(sfc, "ReportLevel", f);
  DeleteTempFiles = getInt(sfc, "DeleteTempFiles", f);
  DCref = getDouble(sfc, "DCref", f);
  base::GetCheckMyProfileString(sfc, "ReportFilename", ReportFilename, 512, f);
  base::GetCheckMyProfileString(sfc, "ProcessingConfFile", ProcessingConfFile, 512, f);

  const char* gpc = "GeneralProcessingConf";
  Flag_rangefoc = getInt(gpc, "Flag_rangefoc", f);
  Flag_rgpatt = getInt(gpc, "Flag_rgpatt", f);
  Flag_azimuthfoc = getInt(gpc, "Flag_azimuthfoc", f);
  Flag_dcest = getInt(gpc, "Flag_dcest", f);
  Flag_ortog = getInt(gpc, "Flag_ortog", f);
  Flag_swstal = getInt(gpc, "Flag_swstal", f);
  Azblk = getInt(gpc, "Azblk", f);
  Multilook = getInt(gpc, "Multilook", f);

  dc = doppler::dcestconf{};
  doppler::read_dcestconf(f, dc);
  dc.Memory = Memory;
  // RADARSAT-1's centroid is several PRFs from zero: the data decide it over the whole span.
  dc.Amb_flag = 1;
  dc.Minamb = std::min(dc.Minamb, -kAmbiguitySpan);
  dc.Maxamb = std::max(dc.Maxamb, kAmbiguitySpan);

  az = stripmap::azimuthconf{};
  stripmap::read_azimuthconf(f, az);
  const char* azs = "AzimuthConf";
  ApplyAzShift = getInt(azs, "ApplyAzShift", f);
  ApplyRgShift = getInt(azs, "ApplyRgShift", f);
  return 0;
}

SARFocuser::SARFocuser(SARFocuser_conf conf, SARFocuser_input input, SARFocuser_output output)
    : conf_(std::move(conf)), input_(std::move(input)), output_(std::move(output)) {}

int SARFocuser::fail(const char* stage, int status) {
  failedStage_ = stage;
  return status;
}

int SARFocuser::run() {
  base::Frame frame("SARFocuser::run");
  if (!exists(input_.RawDataFile)) {
    base::report(0xd, "Raw Data file does not exists!");
    return fail("SARFocuser::run", 10);
  }
  base::report(base::kReportCheckpoint, "STRIPMAP RAW DATA DETECTED, FOCUSSING...");
  if (raw_.readhdr(input_.RawDataFile) != 0) return fail("GeneralRAWData::readhdr", frame.check(10));
  if (!exists(input_.ChirpFile)) {
    base::report(0x11, "Chirp file does not exists!");
    return fail("SARFocuser::run", 10);
  }
  io::DataFile chirp;
  if (chirp.read_hdr(input_.ChirpFile) != 0) return fail("DataFile::read_hdr", frame.check(10));
  conf_.Flag_rgpatt = 0;
  if (int st = frame.check(process())) return st;
  stripmap::progress_open("Writing headers");
  return frame.check(writeheaders());
}

int SARFocuser::process() {
  base::Frame frame("SARFocuser::process");
  const int64_t lines = raw_.dataFile.lines;
  const int32_t samples = raw_.dataFile.pixels;
  const auto& sc = raw_.sampling;
  if (lines < 1 || samples < 1 || !(sc.prf_hz > 0.0) || !(sc.frg_hz > 0.0) || !(sc.lambda_m > 0.0))
    return fail("SARFocuser::process", 10);
  // The orbit of the state vectors: a degree 4 fit over five records, as the readers of the
  // leader's and the text orbit's records fit them.
  const auto& sv = raw_.stateVectors;
  orbit_ = geometry::OrbitData{};
  orbit_.family = geometry::OrbitFamily::kTextOrbit;
  orbit_.path = input_.RawDataFile + ".hdr";
  orbit_.product_name = "STATE_VECTORS";
  for (int k = 0; k < sv.nStateVectors; ++k) {
    geometry::StateVector v;
    v.time = sv.TimeFirst + k * sv.TimeDelta;
    const auto i = static_cast<std::size_t>(3 * k);
    v.position = {sv.pos[i], sv.pos[i + 1], sv.pos[i + 2]};
    v.velocity = {sv.vel[i], sv.vel[i + 1], sv.vel[i + 2]};
    orbit_.vectors.push_back(v);
  }
  orbit_.sensing_start = orbit_.vectors.front().time;
  orbit_.sensing_stop = orbit_.vectors.back().time;
  orbit_.widest_spacing = sv.TimeDelta;

  // The acquisition in the terms of the stripmap stages.
  par_ = metadata::sarpar{};
  par_.slcPath = output_.OutputFilename;
  const auto cut = output_.OutputFilename.find_last_of("/\\");
  par_.outputDir = cut == std::string::npos ? "." : output_.OutputFilename.substr(0, cut);
  par_.extrPath = input_.RawDataFile;
  par_.rgfPath = output_.OutputFilename + ".rgfoc";
  par_.samplingRate = sc.frg_hz;
  par_.carrierFrequency = sc.fc_hz;
  par_.prf = sc.prf_hz;
  par_.nearRangeTime = raw_.roi.fastStart;
  // The receive window's farthest line start (the window moves with SWST changes).
  par_.far_range_time = std::max(raw_.info.SWST_MAX, raw_.roi.fastStart);
  par_.pulse_length = raw_.pulse.PulseLength;
  par_.chirp_bandwidth = raw_.pulse.Bandwidth;
  par_.azimuthStartTime = raw_.roi.slowStart;
  par_.antenna_length = raw_.attitude.AntennaLength > 0.0 ? raw_.attitude.AntennaLength : kAntennaLength;
  par_.swath_rank = raw_.swath.Rank;
  par_.lines = static_cast<int32_t>(lines);
  par_.samples = samples;
  par_.resampling_factor = 1;
  par_.polarization_type = 0;  // H/H

  proc_ = stripmap::procparm{};
  proc_.Flag_incore = 0;  // the pipeline always goes through the range-compressed file
  proc_.Flag_ortog = conf_.Flag_ortog;
  proc_.Flag_swstal = conf_.Flag_swstal;
  proc_.Azblk = conf_.Azblk;
  proc_.Report_level = conf_.ReportLevel;

  // Orbit block: five vectors over the raw lines and the margin on either side.
  const double duration = static_cast<double>(lines) / sc.prf_hz;
  const double centre = par_.azimuthStartTime + 0.5 * duration;
  proc_.orbitSpacing = (duration + 2.0 * kOrbitMargin) / 4.0;
  proc_.orbitStartTime = centre - 2.0 * proc_.orbitSpacing;
  try {
    const geometry::OrbitSamples s = geometry::interpolate_orbit(orbit_, centre, {5, proc_.orbitSpacing, true, false});
    for (std::size_t k = 0; k < 5; ++k)
      for (std::size_t i = 0; i < 3; ++i) {
        proc_.orbitPositions[3 * k + i] = s.positions[k][i];
        proc_.orbitVelocities[3 * k + i] = s.velocities[k][i];
      }
  } catch (const geometry::OrbitError& e) {
    base::report(base::kReportError, e.what());
    return fail("orbit", 10);
  }
  proc_.orbitNumber = std::atoi(raw_.info.OrbitNumber.c_str());

  // Range reference: the nominal chirp of the pulse, as the stripmap chain expects it.
  if (int st = frame.check(metadata::synthetic_chirp(par_, proc_))) return fail("chirp", st);

  if (conf_.Flag_rangefoc) {
    const StageClock clock("range");
    if (int st = frame.check(stripmap::rangefoc(par_, proc_))) return fail("rangefoc", st);
  }

  // Doppler centroid: the geometry's prediction places the search, the data decide.
  const double midRange = par_.nearRangeTime + 0.5 * par_.samples / par_.samplingRate;
  double geometric = 0.0;
  try {
    geometric = unsteered_centroid(orbit_, centre, midRange, sc.lambda_m);
  } catch (const geometry::OrbitError& e) {
    base::report(base::kReportError, e.what());
    return fail("orbit", 10);
  }
  base::LogPrintf("Doppler centroid from the orbit geometry: %.3f Hz\n", geometric);
  stripmap::DopplerPoly poly{};
  poly[7] = par_.nearRangeTime;
  poly[8] = par_.azimuthStartTime;
  if (conf_.DCref != 0.0) {
    poly[0] = conf_.DCref;
    base::LogPrintf("DCref: %f\n", conf_.DCref);
  } else if (conf_.Flag_dcest) {
    const StageClock clock("Doppler");
    stripmap::progress_open("DC Estimation");
    doppler::dcimage image;
    image.path = par_.rgfPath;
    image.samples = proc_.rangeSamples;
    image.lines = proc_.lines;
    image.prf = par_.prf;
    const geometry::StateVector platform = geometry::orbit_state_at(orbit_, centre);
    image.platformSpeed = geometry::norm(platform.velocity) * 6371000.0 / geometry::norm(platform.position);
    image.rangeTimeOrigin = par_.nearRangeTime;
    image.azimuthTimeOrigin = par_.azimuthStartTime;
    doppler::dcestconf dc = conf_.dc;
    dc.carrier = par_.carrierFrequency;
    dc.fs = par_.samplingRate;
    dc.geometricCentroid = geometric;
    dc.inputPath = par_.rgfPath;
    dc.outputDir = par_.outputDir;
    dc.wantedPolyPoints = image.platformSpeed;
    doppler::DopplerPoly estimated{};
    int st = doppler::getnadcpoly(image, dc, estimated);
    const auto good = std::count_if(dc.blocks.begin(), dc.blocks.end(), [](const auto& b) { return b.good; });
    if (st == 0) {
      std::copy(estimated.begin(), estimated.end(), poly.begin());
      centroidFromData_ = true;
    } else if (st == -1 || (st == 10 && !dc.blocks.empty() && good <= 7)) {
      // Too little signal for the block estimate (a dark or point-only scene): the geometry's
      // centroid is the best there is, and the run says so.
      base::report(base::kReportWarning, "Doppler centroid not measurable from the data: the geometric centroid is used");
      poly[0] = geometric;
    } else {
      return fail("getnadcpoly", frame.check(st));
    }
  } else {
    poly[0] = geometric;
  }
  std::copy(poly.begin(), poly.end(), proc_.dopplerCentroid.begin());
  centroid_ = stripmap::DCeval(proc_.dopplerCentroid, midRange, centre);
  base::LogPrintf("Doppler centroid at the scene centre: %.3f Hz\n", centroid_);

  stripmap::progress_open("GEOMETRIC POLYNOMIALS COMPUTATION");
  if (int st = frame.check(stripmap::getgeopoly(par_, proc_))) return fail("getgeopoly", st);

  if (conf_.Flag_azimuthfoc) {
    const StageClock clock("azimuth");
    stripmap::azimuthconf az = conf_.az;
    // A shift equal to the image size asks for the geometric shift of the squint.
    az.azimuthShift = conf_.ApplyAzShift ? static_cast<double>(par_.lines) : 0.0;
    az.rangeShift = conf_.ApplyRgShift ? static_cast<double>(proc_.rangeSamples) : 0.0;
    az.RangeLookBandwidth *= par_.samplingRate;
    az.RangeTransitionBandwidth *= par_.samplingRate;
    az.AzimuthLookBandwidth *= par_.prf;
    az.AzimuthTransitionBandwidth *= par_.prf;
    if (int st = frame.check(stripmap::azimuthfoc(par_, proc_, az))) return fail("azimuthfoc", st);
    base::LogPrintf("SLC: %d lines of %d samples, first line %.9f s, first sample %.12g s\n", proc_.focusedLines,
                    proc_.focusedSamples, proc_.firstLineTime, proc_.firstSampleTime);
    if (int st = frame.check(stripmap::get_coords(proc_, par_))) return fail("get_coords", st);
    if (conf_.DeleteTempFiles) remove_quietly(par_.rgfPath);
  }
  return 0;
}

int SARFocuser::writeheaders() {
  base::Frame frame("SARFocuser::writeheaders");
  if (!conf_.Flag_azimuthfoc) return 0;  // nothing focused to describe
  io::GeneralSLCData slc;
  const double prf = par_.prf, fs = par_.samplingRate;
  slc.dataFile.lines = proc_.focusedLines;
  slc.dataFile.pixels = proc_.focusedSamples;
  slc.dataFile.cellType = io::kFloatComplex;
  slc.roi.SetSlowAxe(proc_.firstLineTime, 1.0 / prf, proc_.focusedLines);
  slc.roi.SetFastAxe(proc_.firstSampleTime, 1.0 / fs, proc_.focusedSamples);

  // The centroid and rate as range polynomials at the first focused line.
  slc.polys.CreatePolys(1, 1);
  auto put = [&](metadata::poly& p, const stripmap::DopplerPoly& d) {
    const double y = proc_.firstLineTime - d[8];
    p.pol = {d[0] + d[2] * y, d[1] + d[3] * y, 0.0, 0.0, d[4], d[5], d[6]};
    p.trg0_s = d[7];
    p.taz0_s = proc_.firstLineTime;
  };
  put(slc.polys.dc[0], proc_.dopplerCentroid);
  put(slc.polys.fr[0], proc_.dopplerRate);

  slc.sampling.clone(raw_.sampling);
  slc.sampling.Brg_hz = conf_.az.RangeLookBandwidth > 0.0 ? std::min(1.0, conf_.az.RangeLookBandwidth) * fs : fs;
  slc.sampling.Baz_hz = conf_.az.AzimuthLookBandwidth > 0.0 ? std::min(1.0, conf_.az.AzimuthLookBandwidth) * prf : prf;
  // The five vectors of the scene's orbit block, which every later geometry uses.
  slc.stateVectors.SVCreate(proc_.orbitStartTime, proc_.orbitSpacing, 5);
  std::copy(proc_.orbitPositions.begin(), proc_.orbitPositions.begin() + 15, slc.stateVectors.pos.begin());
  std::copy(proc_.orbitVelocities.begin(), proc_.orbitVelocities.begin() + 15, slc.stateVectors.vel.begin());
  slc.pulse.clone(raw_.pulse);
  slc.pattern.PatternSamples = 0;  // no elevation pattern for this sensor
  slc.info.clone(raw_.info);
  slc.info.Description = "StripMap level 1 Image File";
  slc.info.ProcessingSoftware = "SARFocuser v1.0";
  slc.info.ProcessingCenter = "Ombrix - Tarvia";
  slc.info.ImageType = "SLC";
  slc.info.SWST_MIN = proc_.firstSampleTime;
  slc.info.SWST_MAX = proc_.firstSampleTime;
  slc.attitude.clone(raw_.attitude);
  slc.attitude.Eq_speed = proc_.equivalentVelocity;
  slc.attitude.Mean_DC = centroid_;
  const double sine = raw_.sampling.lambda_m * centroid_ / (2.0 * proc_.equivalentVelocity);
  slc.attitude.SquintAngle = std::asin(std::clamp(sine, -1.0, 1.0)) / base::kDegree;
  slc.windows.RgMatchedFilterType = "HAMMING";
  slc.windows.AzMatchedFilterType = "HAMMING";
  slc.windows.RgMatchedFilterCoef = conf_.az.RangeWindowHammingParameter;
  slc.windows.AzMatchedFilterCoef = conf_.az.AzimuthWindowHammingParameter;
  slc.windows.RgLookBandwidth = slc.sampling.Brg_hz;
  slc.windows.AzLookBandwidth = slc.sampling.Baz_hz;
  // Corners: near-early, far-early, near-late, far-late, centre of the focused grid.
  const std::array<metadata::geopoint*, 5> where = [&] {
    const bool north = proc_.corners[2].latitude > proc_.corners[0].latitude;
    const bool eastIsFar = proc_.corners[1].longitude > proc_.corners[0].longitude;
    metadata::geopoint* early[2] = {&slc.corners.SouthWest, &slc.corners.SouthEast};
    metadata::geopoint* late[2] = {&slc.corners.NorthWest, &slc.corners.NorthEast};
    if (!north) std::swap(early, late);
    const int nearIdx = eastIsFar ? 0 : 1;
    return std::array<metadata::geopoint*, 5>{early[nearIdx], early[1 - nearIdx], late[nearIdx], late[1 - nearIdx],
                                              &slc.corners.Center};
  }();
  for (std::size_t i = 0; i < 5; ++i) {
    const auto& c = proc_.corners[i];
    where[i]->Point = {c.latitude, c.longitude, 0.0, c.azimuthTime, c.rangeTime};
  }
  if (int st = slc.writehdr(output_.OutputFilename)) return fail("GeneralSAR::GSwrite", frame.check(st));
  return 0;
}

}  // namespace sar::sarfocuser

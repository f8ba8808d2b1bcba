#include "sarfocuser/sarfocuser.hpp"

#include <algorithm>
#include <chrono>
#include <cmath>
#include <filesystem>
#include <span>

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

constexpr double kSpeedOfLight = 299792458.0;
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

SARFocuser::SARFocuser(SARFocuser_conf conf, SARFocuser_input input, SARFocuser_output output,
                       const radarsat::Acquisition& acquisition)
    : conf_(std::move(conf)), input_(std::move(input)), output_(std::move(output)), acq_(acquisition) {}

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
  if (!exists(input_.ChirpFile)) {
    base::report(0x11, "Chirp file does not exists!");
    return fail("SARFocuser::run", 10);
  }
  conf_.Flag_rgpatt = 0;
  return frame.check(process());
}

int SARFocuser::process() {
  base::Frame frame("SARFocuser::process");
  const radarsat::Acquisition& a = acq_;
  if (a.lines < 1 || a.samples < 1 || !(a.prf > 0.0) || !(a.sampling_rate > 0.0)) return fail("SARFocuser::process", 10);

  // The acquisition in the terms of the stripmap stages.
  par_ = metadata::sarpar{};
  par_.slcPath = output_.OutputFilename;
  const auto cut = output_.OutputFilename.find_last_of("/\\");
  par_.outputDir = cut == std::string::npos ? "." : output_.OutputFilename.substr(0, cut);
  par_.extrPath = input_.RawDataFile;
  par_.rgfPath = output_.OutputFilename + ".rgfoc";
  par_.samplingRate = a.sampling_rate;
  par_.carrierFrequency = a.carrier_frequency;
  par_.prf = a.prf;
  par_.nearRangeTime = a.near_range_time;
  par_.far_range_time = a.far_range_time;
  par_.pulse_length = a.pulse_length;
  par_.chirp_bandwidth = a.pulse_bandwidth;
  par_.azimuthStartTime = a.first_line_time;
  par_.antenna_length = kAntennaLength;
  par_.swath_rank = a.pulses_in_flight;
  par_.swst_code = *std::min_element(a.swst.begin(), a.swst.end());
  par_.swst_max_code = *std::max_element(a.swst.begin(), a.swst.end());
  par_.lines = static_cast<int32_t>(a.lines);
  par_.samples = a.samples;
  par_.resampling_factor = 1;
  par_.polarization_type = 0;  // H/H
  par_.swath_number = a.beam_code;

  proc_ = stripmap::procparm{};
  proc_.Flag_incore = 0;  // the pipeline always goes through the range-compressed file
  proc_.Flag_ortog = conf_.Flag_ortog;
  proc_.Flag_swstal = conf_.Flag_swstal;
  proc_.Azblk = conf_.Azblk;
  proc_.Report_level = conf_.ReportLevel;

  // Orbit block: five vectors over the raw lines and the margin on either side.
  const double duration = a.lines / a.prf;
  const double centre = a.first_line_time + 0.5 * duration;
  proc_.orbitSpacing = (duration + 2.0 * kOrbitMargin) / 4.0;
  proc_.orbitStartTime = centre - 2.0 * proc_.orbitSpacing;
  try {
    const geometry::OrbitSamples s = geometry::interpolate_orbit(a.orbit, centre, {5, proc_.orbitSpacing, true, false});
    for (std::size_t k = 0; k < 5; ++k)
      for (std::size_t i = 0; i < 3; ++i) {
        proc_.orbitPositions[3 * k + i] = s.positions[k][i];
        proc_.orbitVelocities[3 * k + i] = s.velocities[k][i];
      }
  } catch (const geometry::OrbitError& e) {
    base::report(base::kReportError, e.what());
    return fail("orbit", 10);
  }
  proc_.orbitNumber = std::atoi(a.leader.dss.orbit_number.c_str());

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
    geometric = unsteered_centroid(a.orbit, centre, midRange, a.wavelength);
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
    const geometry::StateVector sv = geometry::orbit_state_at(a.orbit, centre);
    image.platformSpeed = geometry::norm(sv.velocity) * 6371000.0 / geometry::norm(sv.position);
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

}  // namespace sar::sarfocuser

#include "jobs/stages.hpp"

#include <algorithm>
#include <cmath>
#include <cstdio>
#include <vector>

#include "base/convert.hpp"
#include "base/diagnostics.hpp"
#include "base/errors.hpp"
#include "base/run_services.hpp"
#include "envisat/extract.hpp"
#include "envisat/level0_format.hpp"
#include "envisat/replica_pattern.hpp"
#include "envisat/table_builder.hpp"
#include "doppler/dcest.hpp"
#include "geometry/doppler_geometry.hpp"
#include "stripmap/azimuth_focus.hpp"
#include "stripmap/coords.hpp"
#include "stripmap/geopoly.hpp"
#include "stripmap/progress.hpp"
#include "stripmap/range_calibration.hpp"
#include "stripmap/range_focus.hpp"
#include "base/constants.hpp"

namespace sar::jobs {
namespace {
std::string& failed() {
  static std::string name;
  return name;
}
}  // namespace

const std::string& failed_stage() { return failed(); }
void note_failed_stage(std::string_view name) { failed() = std::string(name); }

int stage_not_built(std::string_view name) {
  note_failed_stage(name);
  const std::string text = std::string(name) + ": stage not available in this build";
  base::report(base::kReportError, text);
  return kStageRejected;
}

namespace {
// A product shorter than its main header says was cut in transfer or on disk. Its whole packets
// can be read, but an image from them would silently miss the rest of the pass.
void refuse_truncated_product(const std::string& path) {
  const envisat::Level0Header h = envisat::read_level0_header(path);
  if (h.statedSize < 0 || h.fileSize >= h.statedSize) return;
  char where[128];
  std::snprintf(where, sizeof where, "%lld of the %lld bytes its MPH states", static_cast<long long>(h.fileSize),
                static_cast<long long>(h.statedSize));
  note_failed_stage("envi_extract");
  base::fatal(base::ec::kFileIo, {path, "level 0 product truncated", where});
}
}  // namespace

int envi_extract(const enviauxfiles& files, std::vector<sarpar>& channels, extconf& extra) {
  base::Frame frame("envi_extract");
  const std::size_t wanted = channels.size();
  const int st = envisat::envi_extract(files.level0, files.ins, files.extracted, channels, extra,
                                       envisat::timeline_table_builder());
  if (st != 0) {
    note_failed_stage("envi_extract");
    return frame.check(st);
  }
  refuse_truncated_product(files.level0);
  if (channels.size() != wanted) {
    // The job and the product disagree on the number of images.
    note_failed_stage("envi_extract");
    base::fatal(base::ec::kBadArguments, {files.level0, "the product holds " + std::to_string(channels.size()) +
                                                            " channels, the job expects " + std::to_string(wanted)});
  }
  for (const sarpar& par : channels) {
    std::string first;
    if (base::sec852myascii(par.azimuthStartTime, first) != 0) first = "(no time)";
    base::LogPrintf("EXTR: %d lines of %d samples from %s\n", par.lines, par.samples, first.substr(0, 27).c_str());
  }
  return 0;
}

void connect_stage_progress() {
  stripmap::stage_progress().open = [](std::string_view label) { base::waitbar_open(label); };
  stripmap::stage_progress().update = [](double percent) { base::waitbar_update(percent); };
}

namespace {
int named(std::string_view stage, int status) {
  if (status != 0) note_failed_stage(stage);
  return status;
}
}  // namespace

int envi_orbit(const std::string& orbitPath, sarpar& par, procparm& proc) {
  return named("envi_orbit", envisat::envi_orbit(orbitPath, par, proc));
}
int envi_rgpattern(const std::string& xcaPath, const std::string& insPath, sarpar& par, procparm& proc) {
  return named("envi_rgpattern", envisat::envi_rgpattern(xcaPath, insPath, par, proc));
}
int envi_syntchirp(sarpar& par, procparm& proc) { return named("envi_syntchirp", envisat::envi_syntchirp(par, proc)); }

// Stages still to come. Each later stage replaces its line here with the real call.
int init_buffer(sarpar& par, procparm& proc) { return named("init_buffer", stripmap::init_buffer(par, proc)); }
int rangefoc(sarpar& par, procparm& proc) { return named("rangefoc", stripmap::rangefoc(par, proc)); }
int EstDopplerENVI(const std::string& orbitPath, double t, double tau, double term1, double term2, double wavelength,
                   double p, double q, double r, double s, double a, double& fdc) {
  return named("EstDopplerENVI", geometry::EstDopplerENVI(orbitPath, t, tau, term1, term2, wavelength, p, q, r, s, a, fdc));
}
int getnadcpoly(const std::string& input, dcestconf& conf, sarpar& par, procparm& proc) {
  doppler::dcimage image;
  image.path = input;
  image.samples = proc.rangeSamples;
  image.lines = proc.lines;
  image.prf = par.prf;
  image.platformSpeed = conf.wantedPolyPoints;  // the job hands over the platform speed there
  image.rangeTimeOrigin = par.nearRangeTime;
  image.azimuthTimeOrigin = par.azimuthStartTime;
  conf.carrier = par.carrierFrequency;
  conf.fs = par.samplingRate;
  if (conf.Flag_incore) conf.coreMatrix = std::span<const dsp::fcomplex>(proc.matrix.data(), proc.matrix.size());
  doppler::DopplerPoly poly{};
  const int st = doppler::getnadcpoly(image, conf, poly);
  conf.coreMatrix = {};
  named("getnadcpoly", st);
  if (st == 0) {
    const auto& g = conf.gates;
    base::LogPrintf("Doppler centroid from the %s%s%s%s\n", doppler::centroid_source_text(g.source),
                    g.failed.empty() ? "" : " (", g.failed.empty() ? "" : (g.failed + " check: " + g.reason).c_str(),
                    g.failed.empty() ? "" : ")");
    std::copy(poly.begin(), poly.end(), proc.dopplerCentroid.begin());
    base::LogPrintf("Doppler centroid at the scene centre: %.3f Hz\n",
                    stripmap::DCeval(proc.dopplerCentroid, par.nearRangeTime + 0.5 * proc.rangeSamples / par.samplingRate,
                                     par.azimuthStartTime + 0.5 * proc.lines / par.prf));
  }
  return st;
}
void centroid_slope_band(const std::string& orbitPath, double t, const sarpar& par, const procparm& proc,
                         dcestconf& conf) {
  conf.geometricSlope = 0.0;
  conf.slopeTolerance = 0.0;
  const double nearTau = par.nearRangeTime;
  const double farTau = par.nearRangeTime + proc.rangeSamples / par.samplingRate;
  geometry::CentroidSlope band;
  int st = 10;
  try {
    const geometry::OrbitData orbit = geometry::read_orbit(orbitPath);
    st = geometry::centroid_slope(orbit, t, nearTau, farTau, base::kSpeedOfLight / par.carrierFrequency, geometry::PointingLaw{},
                                  conf.AttitudeErrorBound, band);
  } catch (const geometry::OrbitError& e) {
    st = e.status();
  }
  if (st != 0 || !std::isfinite(band.slope) || !(band.tolerance > 0.0)) {
    base::report(base::kReportWarning, "Doppler centroid: no geometric range slope from the orbit; the slope check is off");
    return;
  }
  conf.geometricSlope = band.slope;
  conf.slopeTolerance = band.tolerance;
  base::LogPrintf("Doppler centroid range slope allowed by the geometry: %.4g +- %.4g Hz/s (attitude error up to %g deg)\n",
                  band.slope, band.tolerance, conf.AttitudeErrorBound);
}

int getgeopoly(sarpar& par, procparm& proc) { return named("getgeopoly", stripmap::getgeopoly(par, proc)); }
int IMCalibration(sarpar& par, procparm& proc) {
  return named("IMCalibration", stripmap::range_antenna_calibration(par, proc));
}
int azimuthfoc(sarpar& par, procparm& proc, azimuthconf& az) {
  const int st = named("azimuthfoc", stripmap::azimuthfoc(par, proc, az));
  if (st == 0)
    base::LogPrintf("SLC: %d lines of %d samples, first line %.9f s, first sample %.12g s\n", proc.focusedLines,
                    proc.focusedSamples, proc.firstLineTime, proc.firstSampleTime);
  return st;
}
int dest_buffer(sarpar& par, procparm& proc) { return named("dest_buffer", stripmap::dest_buffer(par, proc)); }
int dest_buffer(sarpar& par, procparm& proc, const stripmap::WrittenLines& written) {
  return named("dest_buffer", stripmap::dest_buffer(par, proc, written));
}
int get_coords(procparm& proc, sarpar& par) { return named("get_coords", stripmap::get_coords(proc, par)); }
}  // namespace sar::jobs

// The RADARSAT-1 job: a CEOS raw data set (data file plus the leader lea_01.001 beside it)
// extracted to a raw raster and a replica, focused by the raw-data focuser, annotated as a
// RADARSAT-1 stripmap SLC.
#include <cerrno>
#include <chrono>
#include <cstdlib>
#include <filesystem>

#include "base/diagnostics.hpp"
#include "base/errors.hpp"
#include "base/profile.hpp"
#include "base/run_services.hpp"
#include "hostlib/footprint.hpp"
#include "io/general_sar.hpp"
#include "jobs/annotation.hpp"
#include "jobs/drivers.hpp"
#include "jobs/im_job.hpp"
#include "jobs/job_common.hpp"
#include "radarsat/extract.hpp"
#include "sarfocuser/sarfocuser.hpp"
#include "stripmap/progress.hpp"

namespace sar::jobs {
namespace {

constexpr std::string_view kRsTitle = "Focussing ASAR RS";
constexpr std::string_view kRsBanner = "\nINPUT ASA_RS : [ %s ]\nOUTPUT ROOT NAME : [ %s ]";
constexpr std::string_view kRsParameterFile = "parameters_RS.hdr";

[[noreturn]] void extraction_failed(const radarsat::CeosError& e) {
  note_failed_stage("RADARExtract");
  base::report(base::kReportError, e.what());
  base::fatal(base::ec::kStageFailed, {"RADARExtract()", e.what()});
}

void remove_work_file(const std::string& path) {
  const base::ErrnoGuard keep;
  std::error_code ec;
  if (!std::filesystem::remove(path, ec)) base::report(base::kReportWarning, "Cannot remove file");
}

// The focused set's records the annotation is made from.
constexpr std::array<io::GSObject, 8> kAnnotatedRecords = {io::kGSDataFile,     io::kGSRoi,         io::kGSPolySAR,
                                                            io::kGSSamplingConstants, io::kGSStateVectors, io::kGSPulse,
                                                            io::kGSDataSetInfo, io::kGSSensorAttitude};

}  // namespace

int RSMwritepars(const std::string& headerPath, const std::string& slcPath, const sarpar& focusedPar,
                 const procparm& focusedProc, const azimuthconf& az) {
  base::Frame frame("RSMwritepars");
  // The focused image as its header describes it.
  io::GeneralSAR gs;
  const std::string slcHeader = io::header_of(slcPath);
  const int read = gs.GSread(slcHeader);
  base::TracePrintf("Trying to read %s, returning with result %d\n", slcHeader.c_str(), read);
  if (read != 0) return frame.check(1);
  for (const io::GSObject slot : kAnnotatedRecords) {
    if (!gs.GSexists(slot)) {
      base::report(base::kReportError, slcHeader + ": the focused image's description lacks a record (slot " +
                                           std::to_string(static_cast<int>(slot)) + ")");
      return frame.check(1);
    }
  }
  if (gs.stateVectors.nStateVectors != 5 || gs.polys.ndc < 1 || gs.polys.nfr < 1) {
    base::report(base::kReportError, slcHeader + ": the focused image's description has no orbit block or polynomials");
    return frame.check(1);
  }

  // Grid, rates, pulse, orbit and polynomials from the description; what it does not carry
  // (corners, angles, spacings) from the focuser.
  sarpar par = focusedPar;
  procparm proc = focusedProc;
  par.prf = gs.sampling.prf_hz;
  par.samplingRate = gs.sampling.frg_hz;
  par.carrierFrequency = gs.sampling.fc_hz;
  par.pulse_length = gs.pulse.PulseLength;
  par.chirp_bandwidth = gs.pulse.Bandwidth;
  proc.focusedLines = gs.dataFile.lines;
  proc.focusedSamples = gs.dataFile.pixels;
  proc.firstLineTime = gs.roi.slowStart;
  proc.firstSampleTime = gs.roi.fastStart;
  proc.orbitStartTime = gs.stateVectors.TimeFirst;
  proc.orbitSpacing = gs.stateVectors.TimeDelta;
  std::copy_n(gs.stateVectors.pos.begin(), 15, proc.orbitPositions.begin());
  std::copy_n(gs.stateVectors.vel.begin(), 15, proc.orbitVelocities.begin());
  auto take = [](const metadata::poly& p, stripmap::DopplerPoly& d) {
    d = {p.pol[0], p.pol[1], 0.0, 0.0, p.pol[4], p.pol[5], p.pol[6], p.trg0_s, p.taz0_s};
  };
  take(gs.polys.dc[0], proc.outputCentroid);
  take(gs.polys.fr[0], proc.outputRate);
  proc.equivalentVelocity = gs.attitude.Eq_speed > 0.0 ? gs.attitude.Eq_speed : proc.equivalentVelocity;

  AnnotationProduct product;
  product.originData = "RADARSAT1_RAW";
  product.sceneDataPrefix = "RADARSAT-1|RADARSAT1_RAW|";
  product.sensorName = gs.info.SensorName;
  product.swath = gs.info.Swath;
  product.writeEnvisatCalibration = false;
  if (write_stripmap_annotation(headerPath, par, proc, az, product) != 0) return frame.check(1);

  // The pulse as the focuser used it, traced as the host's readers expect.
  const double bandwidth = gs.pulse.Bandwidth, duration = gs.pulse.PulseLength;
  int st = base::WriteProfileDoubleArray("ChannelInfo", "BandWidth", {&bandwidth, 1}, headerPath);
  base::TracePrintf("Trying to write (BandWidth = %f) in file %s, returning with result %d\n", bandwidth,
                    headerPath.c_str(), st);
  int st2 = base::WriteProfileDoubleArray("ChannelInfo", "PulseDuration", {&duration, 1}, headerPath);
  base::TracePrintf("Trying to write (PulseDuration = %f) in file %s, returning with result %d\n", duration,
                    headerPath.c_str(), st2);
  if (st != 0 || st2 != 0 || base::SyncProfile(headerPath) != 0) return frame.check(1);
  return frame.check(convert_annotation(headerPath));
}

int main_focussing_asar_rs(const std::string& listPath) {
  const std::vector<std::string> args = start_job(listPath, kRsTitle, kRsBanner, {0, 2});
  const std::string parameterFile = description_dir() + std::string(kRsParameterFile);
  const std::string dataFile = args[0] == kNotOK ? std::string() : args[0];
  const std::string orbitFile = args[1] == kNotOK ? std::string() : args[1];
  if (args[2] == kNotOK || args[2].empty()) base::fatal(base::ec::kBadArguments, {"OUTPUT ROOT NAME"});
  const std::string slcPath = args[2] + "_slc";
  const std::string dir = directory_of(slcPath);
  const std::string leaderFile = directory_of(dataFile) + "/lea_01.001";
  const int quickLook1 = std::atoi(args[3].c_str());
  const int quickLook2 = std::atoi(args[4].c_str());
  {
    // The output root may name a folder the host has not made yet.
    const base::ErrnoGuard keep;
    std::error_code made;
    std::filesystem::create_directories(dir, made);
  }

  radarsat::ExtractRequest request;
  request.data_file = dataFile;
  request.leader_file = leaderFile;
  request.orbit_file = orbitFile;
  request.raw_path = dir + "/RAW";
  request.chirp_path = dir + "/CHIRP";
  request.progress = [](int percent) { base::waitbar_update(percent); };

  // A focused CEOS product needs no focuser; its extraction is not part of this system.
  try {
    if (radarsat::read_leader(leaderFile).is_slc()) {
      const std::string text = leaderFile + ": CEOS SLC products are not extracted by this system";
      note_failed_stage("extractSLC");
      base::report(base::kReportError, text);
      base::fatal(base::ec::kStageFailed, {"extractSLC()", text});
    }
  } catch (const radarsat::CeosError& e) {
    extraction_failed(e);
  }

  connect_stage_progress();
  radarsat::Acquisition acquisition;
  const auto extractionStart = std::chrono::steady_clock::now();
  try {
    base::waitbar_open("Extracting Radarsat RAW Data");
    acquisition = radarsat::radar_extract(request);
  } catch (const radarsat::CeosError& e) {
    extraction_failed(e);
  }
  base::LogPrintf("Stage time %-14s %9.2f s\n", "extraction",
                  std::chrono::duration<double>(std::chrono::steady_clock::now() - extractionStart).count());
  base::LogPrintf("RADARSAT-1 %s: %lld lines of %d samples, PRF %.3f Hz, %lld missing lines, %lld records dropped\n",
                  acquisition.beam.c_str(), static_cast<long long>(acquisition.lines), acquisition.samples,
                  acquisition.prf, static_cast<long long>(acquisition.missing_lines),
                  static_cast<long long>(acquisition.dropped_records));
  base::LogPrintf("State vectors from %s\n", orbitFile.empty() ? leaderFile.c_str() : orbitFile.c_str());

  sarfocuser::SARFocuser_conf conf;
  if (conf.readconf(parameterFile) != 0) base::fatal(base::ec::kStageFailed, {"SARFocuser_conf::readconf()"});
  sarfocuser::SARFocuser focuser(conf, {request.raw_path, request.chirp_path, ""}, {slcPath});
  if (focuser.run() != 0) {
    note_failed_stage(focuser.failed_stage());
    base::fatal(base::ec::kStageFailed, {"SARFocuser::run()", focuser.failed_stage()});
  }
  if (conf.DeleteTempFiles)
    for (const std::string& f : {request.raw_path, request.raw_path + ".hdr", request.raw_path + ".vrt"})
      remove_work_file(f);

  // Annotation: the stripmap sections with RADARSAT-1's values, from the focused image's
  // description (which stays beside it as its raster header).
  const std::string headerPath = slcPath + "_hdr";
  if (RSMwritepars(headerPath, slcPath, focuser.par(), focuser.proc(), focuser.az()) != 0) {
    base::DeleteProductFile(slcPath, true);
    note_failed_stage("RSMwritepars");
    base::fatal(base::ec::kStageFailed, {"RSMwritepars()", failed_stage()});
  }
  hostlib::write_footprint(slcPath, hostlib::kFootprintAllFiles);
  errno = 0;

  if (args[12] == "OK") {
    base::SetActivityLabel("Tiff generation ...");
    if (write_quicklook(slcPath, slcPath + ".tif", std::atof(args[13].c_str()), quickLook1, quickLook2,
                        focuser.proc()) != 0)
      base::fatal(base::ec::kStageFailed, {"GeoTIFF", failed_stage()});
  }
  return 0;
}

}  // namespace sar::jobs

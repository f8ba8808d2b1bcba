#include "jobs/im_job.hpp"

#include <cerrno>
#include <chrono>
#include <complex>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <span>

#include "base/diagnostics.hpp"
#include "base/errors.hpp"
#include "base/profile.hpp"
#include "base/run_services.hpp"
#include "envisat/product_types.hpp"
#include "hostlib/footprint.hpp"
#include "hostlib/quicklook.hpp"
#include "jobs/annotation.hpp"
#include "jobs/aux_lookup.hpp"
#include "jobs/drivers.hpp"
#include "jobs/job_common.hpp"
#include "stripmap/raster_files.hpp"

namespace sar::jobs {
namespace {

constexpr std::string_view kImBanner =
    "\nINPUT ASA_IM : [ %s ]\nINPUT DORIS : [ %s ]\nINPUT ASA_INS : [ %s ]\nINPUT ASA_XCA : [ %s ]\nOUTPUT ROOT "
    "NAME : [ %s ]";
constexpr double kSpeedOfLight = 299792458.0;
constexpr double kWantedPolyPoints = 6900.0;
// Attitude law terms of the geometric Doppler prediction.
constexpr double kAttitude[7] = {1.0, 10.0, 0.0 /* wavelength */, 3.912987, -0.167074, 0.050233, 23.0};

void remove_work_file(const std::string& path) {
  std::error_code ec;
  if (!std::filesystem::remove(path, ec)) base::report(base::kReportWarning, "Cannot remove file");
}

int getInt(const char* section, const char* key, const std::string& file) {
  return base::GetCheckMyProfileInt(section, key, file);
}

}  // namespace

std::string directory_of(const std::string& path) {
  const auto cut = path.find_last_of("/\\");
  if (cut == std::string::npos) return ".";
  return path.substr(0, cut);
}

int IMreadpars(const std::string& parameterFile, sarpar& par, procparm& proc, dcestconf& dc, azimuthconf& az,
               enviauxfiles& files, StageFlags& flags) {
  base::Frame frame("IMreadpars()");
  (void)files;
  par = sarpar{};
  proc = procparm{};
  dc = dcestconf{};
  az = azimuthconf{};
  flags = {1, 1, 0, 1, 1, 1, 1, 1};

  const std::string& f = parameterFile;
  const char* gpc = "GeneralProcessingConf";
  proc.Flag_incore = getInt(gpc, "Flag_incore", f);
  proc.Flag_ortog = getInt(gpc, "Flag_ortog", f);
  proc.Flag_swstal = getInt(gpc, "Flag_swstal", f);
  proc.Azblk = getInt(gpc, "Azblk", f);
  {
    int32_t level = 0;  // optional: stays 0 when absent
    if (base::GetMyProfileIntArray(gpc, "Report_level", std::span<int32_t>(&level, 1), f) == base::kProfileOk)
      proc.Report_level = level;
  }

  doppler::read_dcestconf(f, dc);
  // The IM parameter file must say which terms of the centroid surface are fitted.
  base::GetCheckMyProfileIntArray("DCestConf", "Pol_Weights", dc.Pol_Weights, f);
  dc.progressFlag = proc.progressFlag;
  dc.Flag_incore = proc.Flag_incore;

  stripmap::read_azimuthconf(f, az);
  const char* azs = "AzimuthConf";
  // The shifts scale with the product's size, which is not known before the extraction.
  az.azimuthShift = getInt(azs, "ApplyAzShift", f) * static_cast<double>(par.lines);
  az.rangeShift = getInt(azs, "ApplyRgShift", f) * static_cast<double>(par.samples);
  return 0;
}

namespace {
// Wall time of one stage into the log, so that an operator sees where a slow run spent it.
class StageClock {
 public:
  // A stage that is itself writing reports its whole time; others report the raster writes
  // they made apart from their own work.
  explicit StageClock(const char* stage, bool writing = false)
      : stage_(stage), writingStage_(writing), writing_(stripmap::output_write_seconds()) {}
  StageClock(const StageClock&) = delete;
  StageClock& operator=(const StageClock&) = delete;
  ~StageClock() {
    const double total = std::chrono::duration<double>(std::chrono::steady_clock::now() - start_).count();
    const double writing = stripmap::output_write_seconds() - writing_;
    if (writing > 0.0 && !writingStage_) {
      base::LogPrintf("Stage time %-14s %9.2f s\n", stage_, total - writing);
      base::LogPrintf("Stage time %-14s %9.2f s\n", "raster writes", writing);
    } else {
      base::LogPrintf("Stage time %-14s %9.2f s\n", stage_, total);
    }
  }

 private:
  const char* stage_;
  bool writingStage_;
  double writing_;
  std::chrono::steady_clock::time_point start_ = std::chrono::steady_clock::now();
};
}  // namespace

int IMprocessor(sarpar& par, procparm& proc, dcestconf& dc, azimuthconf& az, extconf& extra, enviauxfiles& files,
                StageFlags& flags) {
  base::Frame frame("IMprocessor");
  const std::string dir = par.outputDir;
  connect_stage_progress();

  if (flags[kStageExtract]) {
    const StageClock clock("extraction");
    if (int st = frame.check(envi_extract(files, par, extra))) return st;
    if (int st = frame.check(envi_orbit(files.orbit, par, proc))) return st;
    if (int st = frame.check(envi_rgpattern(files.xca, files.ins, par, proc))) return st;
    if (int st = frame.check(envi_syntchirp(par, proc))) return st;
  }
  {
    const StageClock clock("range");
    if (proc.Flag_incore) {
      if (int st = frame.check(init_buffer(par, proc))) return st;
      // With the data in memory there are no work files to remove.
      flags[kStageCleanup] = 0;
    }
    if (flags[kStageRangeFocus]) {
      if (int st = frame.check(rangefoc(par, proc))) return st;
      if (flags[kStageCleanup]) remove_work_file(par.extrPath);
    }
  }
  if (flags[kStageDoppler]) {
    const StageClock clock("Doppler");
    // The centroid the geometry predicts at the scene centre: mid-scene azimuth time and the
    // mid-swath two-way time, with the yaw-steering law of the platform.
    const double wavelength = kSpeedOfLight / par.carrierFrequency;
    const double midTime = par.azimuthStartTime + par.lines / (2.0 * par.prf);
    const double midRange = 0.5 * par.samples / par.samplingRate + par.nearRangeTime;
    if (int st = frame.check(EstDopplerENVI(files.orbit, midTime, midRange, kAttitude[0], kAttitude[1], wavelength,
                                            kAttitude[3], kAttitude[4], kAttitude[5], kAttitude[6], 0.0,
                                            dc.geometricCentroid)))
      return st;
    centroid_slope_band(files.orbit, midTime, par, proc, dc);
    dc.inputPath = par.rgfPath;
    dc.outputDir = dir;
    dc.wantedPolyPoints = kWantedPolyPoints;
    if (int st = frame.check(getnadcpoly(dc.inputPath, dc, par, proc))) return st;
    if (int st = frame.check(getgeopoly(par, proc))) return st;
    if (flags[kStageCleanup]) remove_work_file(dir + "/DCEST_resume.txt");
  }
  if (flags[kStageCalibration]) {
    if (int st = frame.check(IMCalibration(par, proc))) return st;
  }
  if (flags[kStageAzimuth]) {
    const StageClock clock("azimuth");
    if (az.rangeShift == par.samples) az.rangeShift = proc.rangeSamples;
    az.RangeLookBandwidth *= par.samplingRate;
    az.RangeTransitionBandwidth *= par.samplingRate;
    az.AzimuthLookBandwidth *= par.prf;
    az.AzimuthTransitionBandwidth *= par.prf;
    if (int st = frame.check(azimuthfoc(par, proc, az))) return st;
    if (int st = frame.check(get_coords(proc, par))) return st;
    az.RangeLookBandwidth /= par.samplingRate;
    az.RangeTransitionBandwidth /= par.samplingRate;
    az.AzimuthLookBandwidth /= par.prf;
    az.AzimuthTransitionBandwidth /= par.prf;
    if (flags[kStageCleanup]) remove_work_file(par.rgfPath);
  }
  if (proc.Flag_incore) {
    // With the data in memory the SLC is written here.
    const StageClock clock("SLC writing", true);
    if (int st = frame.check(dest_buffer(par, proc))) return st;
  }
  return 0;
}

// Quick-look of the SLC: amplitude averaged down to the requested size, tied to the ground by the
// corners that get_coords placed.
int write_quicklook(const std::string& slcPath, const std::string& tifPath, double scale, int width, int height,
                    const procparm& proc) {
  hostlib::QuickLookRequest request;
  request.maxWidth = width > 0 ? width : 1024;
  request.maxHeight = height > 0 ? height : 1024;
  request.scale = scale > 0.0 ? scale : 1.0;
  request.rangeSpacing = proc.rangePixelSpacing > 0.0 ? proc.rangePixelSpacing : 1.0;
  request.azimuthSpacing = proc.azimuthPixelSpacing > 0.0 ? proc.azimuthPixelSpacing : 1.0;
  for (std::size_t i = 0; i < 4; ++i) request.corners[i] = {proc.corners[i].latitude, proc.corners[i].longitude};
  std::FILE* in = std::fopen(slcPath.c_str(), "rb");
  if (!in) {
    note_failed_stage("quick-look: " + slcPath + " cannot be opened");
    return 10;
  }
  const int samples = proc.focusedSamples;
  auto source = [&](int line, std::span<std::complex<float>> row) {
    const auto offset = static_cast<long long>(line) * samples * 8;
    return fseeko(in, static_cast<off_t>(offset), SEEK_SET) == 0 &&
           std::fread(row.data(), 8, row.size(), in) == row.size();
  };
  const int st = hostlib::write_quicklook_geotiff(tifPath, proc.focusedLines, samples, source, request);
  std::fclose(in);
  if (st != 0) note_failed_stage("quick-look GeoTIFF " + tifPath);
  return st;
}

int main_focussing_asar_im(const std::string& listPath) {
  const std::vector<std::string> args = start_job(listPath, kImTitle, kImBanner, {0, 1, 2, 3, 4});
  const std::string desDir = description_dir();
  const std::string parameterFile = desDir + std::string(kImParameterFile);
  const std::string slcPath = args[4] + "_slc";
  const int quickLook1 = std::atoi(args[5].c_str());
  const int quickLook2 = std::atoi(args[6].c_str());

  sarpar par;
  procparm proc;
  dcestconf dc;
  azimuthconf az;
  // The whole product, echoes only; the side tables live as long as the job.
  extconf extra;
  extra.skip_percent = 0;
  extra.extract_percent = 100;
  extra.extract_kind = envisat::kExtractEchoes;
  enviauxfiles files;
  StageFlags flags{1, 1, 0, 1, 1, 1, 1, 1};

  if (args[0] == kNotOK) base::fatal(base::ec::kBadArguments, {"ASA_IM0"});
  require_existing(args[0]);
  if (!envisat::EnvisatTypes(args[0]).is_im0()) base::fatal(base::ec::kBadArguments, {"ASA_IM0"});

  if (args[3] == kNotOK) {
    // Calibration is off in this job, so a missing ASA_XCA does not stop it.
    if (find_aux(args[0], desDir, "ASA_XCA", files.xca) != 0) flags[kStageCalibration] = 0;
    else base::LogPrintf("ASA_XCA from the auxiliary index: %s\n", files.xca.c_str());
  } else {
    require_existing(args[3]);
    files.xca = args[3];
  }
  if (args[2] == kNotOK) {
    if (find_aux(args[0], desDir, "ASA_INS", files.ins) != 0) {
      note_failed_stage("find_aux");
      base::fatal(base::ec::kStageFailed, {"find_aux()"});
    }
    base::LogPrintf("ASA_INS from the auxiliary index: %s\n", files.ins.c_str());
  } else {
    require_existing(args[2]);
    files.ins = args[2];
  }
  if (args[1] == kNotOK) base::fatal(base::ec::kBadArguments, {"DOR_VOR"});
  require_existing(args[1]);
  {
    const envisat::EnvisatTypes orbit(args[1]);
    if (!orbit.is_dorvor() && !orbit.is_dorpor()) base::fatal(base::ec::kBadArguments, {"DOR_VOR"});
  }

  if (IMreadpars(parameterFile, par, proc, dc, az, files, flags) != 0)
    base::fatal(base::ec::kStageFailed, {"IMreadpars_kelvor()"});

  files.level0 = args[0];
  files.orbit = args[1];
  par.slcPath = slcPath;
  par.outputDir = directory_of(slcPath);
  {
    // The output root may name a folder the host has not made yet.
    const base::ErrnoGuard keep;
    std::error_code made;
    std::filesystem::create_directories(par.outputDir, made);
  }
  par.extrPath = par.outputDir + "/EXTR";
  par.rgfPath = par.extrPath + ".rgf";
  par.reportPath = par.outputDir + "/report.bin";

  flags[kStageCleanup] = 1;
  if (IMprocessor(par, proc, dc, az, extra, files, flags) != 0)
    base::fatal(base::ec::kStageFailed, {"IMprocessor()", failed_stage()});

  {
    const StageClock clock("product files");
    const std::string headerPath = slcPath + "_hdr";
    if (IMwritepars(headerPath, par, proc, dc, az, extra, files) != 0) {
      // An SLC without its annotation cannot be used, and beside a half-written description it
      // would look like a product: take it all away.
      base::DeleteProductFile(slcPath, true);
      base::fatal(base::ec::kStageFailed, {"IMwritepars_kelvor()", failed_stage()});
    }
    // Where the scene lies, for map tools; a product without it is still a product, so a failure
    // here is reported and the job goes on.
    hostlib::write_footprint(slcPath, hostlib::kFootprintAllFiles);
    errno = 0;

    if (args[12] == "OK") {
      base::SetActivityLabel("Tiff generation ...");
      const std::string label = base::activity_label();
      base::getAndSetPerc(-1, 0, &label);
      base::getAndSetPerc(-1, 0, nullptr);
      if (write_quicklook(slcPath, slcPath + ".tif", std::atof(args[13].c_str()), quickLook1, quickLook2, proc) != 0)
        base::fatal(base::ec::kStageFailed, {"GeoTIFF", failed_stage()});
    }
  }
  return 0;
}

}  // namespace sar::jobs

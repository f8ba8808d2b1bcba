#include "jobs/stripmap_job.hpp"

#include <cerrno>
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
#include "envisat/product_types.hpp"
#include "geometry/doppler_geometry.hpp"
#include "hostlib/footprint.hpp"
#include "hostlib/quicklook.hpp"
#include "jobs/aux_lookup.hpp"
#include "jobs/drivers.hpp"
#include "jobs/job_common.hpp"
#include "base/constants.hpp"

namespace sar::jobs {
namespace {

using base::kSpeedOfLight;
constexpr double kWantedPolyPoints = 6900.0;
// The two terms the geometric Doppler prediction carries before the wavelength.
constexpr double kCarriedTerms[2] = {1.0, 10.0};

void remove_work_file(const std::string& path) {
  std::error_code ec;
  if (!std::filesystem::remove(path, ec)) base::report(base::kReportWarning, "Cannot remove file");
}

int getInt(const char* section, const char* key, const std::string& file) {
  return base::GetCheckMyProfileInt(section, key, file);
}

// The centroid the geometry predicts at the image centre (mid-image azimuth time, mid-swath
// two-way time, the platform's yaw-steering law), and the range slope it allows, into the
// image's estimator configuration.
int doppler_geometry(const std::string& orbitPath, StripmapChannel& c) {
  const sarpar& par = c.par;
  const double wavelength = kSpeedOfLight / par.carrierFrequency;
  const double midTime = par.azimuthStartTime + par.lines / (2.0 * par.prf);
  const double midRange = 0.5 * par.samples / par.samplingRate + par.nearRangeTime;
  const geometry::PointingLaw law;  // the platform's yaw-steering law
  if (int st = EstDopplerENVI(orbitPath, midTime, midRange, kCarriedTerms[0], kCarriedTerms[1], wavelength, law.p_deg,
                              law.q_deg, law.r_deg, law.s_deg, law.a_rad, c.dc.geometricCentroid))
    return st;
  centroid_slope_band(orbitPath, midTime, par, c.proc, c.dc);
  c.dc.inputPath = par.rgfPath;
  c.dc.outputDir = par.outputDir;
  c.dc.wantedPolyPoints = kWantedPolyPoints;
  return 0;
}

// Azimuth focusing takes its bands in Hz; the parameter file gives them as shares of the
// sampling rates. They are scaled back after the corners, as the annotation reads them.
int focus_azimuth(StripmapChannel& c) {
  sarpar& par = c.par;
  azimuthconf& az = c.az;
  if (az.rangeShift == par.samples) az.rangeShift = c.proc.rangeSamples;
  az.RangeLookBandwidth *= par.samplingRate;
  az.RangeTransitionBandwidth *= par.samplingRate;
  az.AzimuthLookBandwidth *= par.prf;
  az.AzimuthTransitionBandwidth *= par.prf;
  int st = azimuthfoc(par, c.proc, az);
  if (st == 0) st = get_coords(c.proc, par);
  az.RangeLookBandwidth /= par.samplingRate;
  az.RangeTransitionBandwidth /= par.samplingRate;
  az.AzimuthLookBandwidth /= par.prf;
  az.AzimuthTransitionBandwidth /= par.prf;
  return st;
}

// One image's share of the paths: "<D>/EXTR" for the single image of IM, "<D>/EXTR<i>" for
// image i of AP, so that the images' work files never collide.
void set_work_paths(sarpar& par, const std::string& slcPath, int image, int images) {
  par.slcPath = slcPath;
  par.outputDir = directory_of(slcPath);
  par.extrPath = par.outputDir + "/EXTR" + (images > 1 ? std::to_string(image) : std::string());
  if (images > 1) par.raw_file = par.extrPath;
  par.rgfPath = par.extrPath + ".rgf";
  par.reportPath = par.outputDir + "/report.bin";
}

// A given auxiliary file of the wrong type ends the job before any work.
void check_aux_type(const std::string& path, bool ok, std::string_view detail) {
  if (!ok) base::fatal(base::ec::kBadArguments, {std::string(detail), path, "not of that product type"});
}

}  // namespace

// An input that fails inside the chain: an orbit that does not reach over the image is a stage
// that cannot run (the record tells the image's times beside the file's span); any other fault
// keeps the code its reader gave it.
void fail_on_input(const base::InputError& e, const std::string& processorDetail, const sarpar& par) {
  base::report(base::kReportError, e.what());
  int32_t code = e.host_code();
  std::string text = e.what();
  if (e.fault() == base::InputFault::kNotCovering) {
    code = base::ec::kStageFailed;
    // The record has room for little: the times without their fractions, the file in the log.
    const auto utc = [](double t) {
      std::string s;
      return base::sec852myascii(t, s) == 0 ? s.substr(0, 20) : std::string("?");
    };
    text = "scene " + utc(par.azimuthStartTime) + " to " + utc(par.azimuthStartTime + par.lines / par.prf).substr(12) +
           " outside orbit " + utc(e.span_start()) + " to " + utc(e.span_stop());
  }
  base::fatal(code, {processorDetail, failed_stage(), text});
}

std::string directory_of(const std::string& path) {
  const auto cut = path.find_last_of("/\\");
  if (cut == std::string::npos) return ".";
  return path.substr(0, cut);
}

int read_stripmap_parameters(const std::string& parameterFile, StripmapChannel& channel, StageFlags& flags,
                             bool polWeightsRequired) {
  sarpar& par = channel.par;
  procparm& proc = channel.proc;
  dcestconf& dc = channel.dc;
  azimuthconf& az = channel.az;
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
  if (polWeightsRequired) {
    // The IM parameter file must say which terms of the centroid surface are fitted.
    base::GetCheckMyProfileIntArray("DCestConf", "Pol_Weights", dc.Pol_Weights, f);
  } else {
    // A file without the key fits every term: a mask of zeros would fit nothing.
    std::fill(std::begin(dc.Pol_Weights), std::end(dc.Pol_Weights), 1);
  }
  dc.progressFlag = proc.progressFlag;
  dc.Flag_incore = proc.Flag_incore;

  stripmap::read_azimuthconf(f, az);
  const char* azs = "AzimuthConf";
  // The shifts scale with the product's size, which is not known before the extraction.
  az.azimuthShift = getInt(azs, "ApplyAzShift", f) * static_cast<double>(par.lines);
  az.rangeShift = getInt(azs, "ApplyRgShift", f) * static_cast<double>(par.samples);
  return 0;
}

// The quick-look request of an image from the job's arguments (requested size and brightness).
hostlib::QuickLookRequest quicklook_request(double scale, int width, int height, const procparm& proc) {
  hostlib::QuickLookRequest request;
  request.maxWidth = width > 0 ? width : 1024;
  request.maxHeight = height > 0 ? height : 1024;
  request.scale = scale > 0.0 ? scale : 1.0;
  request.rangeSpacing = proc.rangePixelSpacing > 0.0 ? proc.rangePixelSpacing : 1.0;
  request.azimuthSpacing = proc.azimuthPixelSpacing > 0.0 ? proc.azimuthPixelSpacing : 1.0;
  for (std::size_t i = 0; i < 4; ++i) request.corners[i] = {proc.corners[i].latitude, proc.corners[i].longitude};
  return request;
}

StageChain<StripmapChannel> stripmap_chain(const StageFlags& flags, const enviauxfiles& files, bool incore,
                                           const QuickLookOptions& quicklook) {
  using C = StripmapChannel;
  const bool cleanup = flags[kStageCleanup] != 0 && !incore;  // with the data in memory nothing is left to remove
  StageChain<C> chain;
  chain.then("envi_orbit", "references", [&files](C& c) { return envi_orbit(files.orbit, c.par, c.proc); },
             flags[kStageExtract] != 0)
      .then("envi_rgpattern", "references",
            [&files](C& c) { return envi_rgpattern(files.xca, files.ins, c.par, c.proc); }, flags[kStageExtract] != 0)
      .then("envi_syntchirp", "references", [](C& c) { return envi_syntchirp(c.par, c.proc); },
            flags[kStageExtract] != 0)
      .then("init_buffer", "range", [](C& c) { return init_buffer(c.par, c.proc); }, incore)
      .then("rangefoc", "range", [](C& c) { return rangefoc(c.par, c.proc); }, flags[kStageRangeFocus] != 0)
      .then("remove EXTR", "range",
            [](C& c) {
              remove_work_file(c.par.extrPath);
              return 0;
            },
            flags[kStageRangeFocus] != 0 && cleanup)
      .then("EstDopplerENVI", "Doppler", [&files](C& c) { return doppler_geometry(files.orbit, c); },
            flags[kStageDoppler] != 0)
      .then("getnadcpoly", "Doppler", [](C& c) { return getnadcpoly(c.dc.inputPath, c.dc, c.par, c.proc); },
            flags[kStageDoppler] != 0)
      .then("getgeopoly", "Doppler", [](C& c) { return getgeopoly(c.par, c.proc); }, flags[kStageDoppler] != 0)
      .then("remove DCEST_resume", "Doppler",
            [](C& c) {
              remove_work_file(c.par.outputDir + "/DCEST_resume.txt");
              return 0;
            },
            flags[kStageDoppler] != 0 && cleanup)
      .then("IMCalibration", "", [](C& c) { return IMCalibration(c.par, c.proc); }, flags[kStageCalibration] != 0)
      .then("azimuthfoc", "azimuth", focus_azimuth, flags[kStageAzimuth] != 0)
      .then("remove EXTR.rgf", "azimuth",
            [](C& c) {
              remove_work_file(c.par.rgfPath);
              return 0;
            },
            flags[kStageAzimuth] != 0 && cleanup)
      // With the data in memory the SLC is written here; the quick-look's sums are taken from
      // each run of lines as it is written, so that the quick-look need not read the SLC back.
      .then("dest_buffer", "SLC writing",
            [quicklook](C& c) {
              c.quicklook = hostlib::QuickLookGrid();
              if (!quicklook.wanted) return dest_buffer(c.par, c.proc);
              const hostlib::QuickLookRequest r = quicklook_request(quicklook.scale, quicklook.width, quicklook.height, c.proc);
              // Without sums the quick-look reads the SLC back: a refused grid costs time only.
              if (c.quicklook.start(c.proc.focusedLines, c.proc.focusedSamples, r) != 0) return dest_buffer(c.par, c.proc);
              const int samples = c.proc.focusedSamples;
              return dest_buffer(c.par, c.proc, [&c, samples](int32_t first, int32_t count, const std::complex<float>* lines) {
                hostlib::quicklook_add(c.quicklook, first, count, lines, samples);
              });
            },
            incore, true);
  return chain;
}

// Quick-look of the SLC: amplitude averaged down to the requested size, tied to the ground by the
// corners that get_coords placed. From the sums taken in memory when there are any, else from
// the SLC file.
int write_quicklook(const std::string& slcPath, const std::string& tifPath, double scale, int width, int height,
                    const procparm& proc, const hostlib::QuickLookGrid* sums) {
  const hostlib::QuickLookRequest request = quicklook_request(scale, width, height, proc);
  if (sums && sums->lines == proc.focusedLines && sums->samples == proc.focusedSamples && sums->lines > 0) {
    const int st = hostlib::write_quicklook_grid(tifPath, *sums, request);
    if (st != 0) note_failed_stage("quick-look GeoTIFF " + tifPath);
    return st;
  }
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

int run_stripmap_job(const std::string& listPath, const StripmapJobKind& kind) {
  // Inputs.
  const std::vector<std::string> args = start_job(listPath, kind.title, kind.banner, {0, 1, 2, 3, 4});
  const std::string desDir = description_dir();
  const std::string parameterFile = desDir + std::string(kind.parameterFile);
  const int quickLook1 = std::atoi(args[5].c_str());
  const int quickLook2 = std::atoi(args[6].c_str());
  const std::string productDetail(kind.productDetail);

  enviauxfiles files;
  StageFlags flags{1, 1, 0, 1, 1, 1, 1, 1};
  if (args[0] == kNotOK) base::fatal(base::ec::kBadArguments, {productDetail});
  require_existing(args[0]);
  const std::vector<std::string> words = kind.images(args[0]);
  const int images = static_cast<int>(words.size());

  if (args[3] == kNotOK) {
    // Calibration is off in these jobs, so a missing ASA_XCA does not stop them.
    if (find_aux(args[0], desDir, "ASA_XCA", files.xca) != 0) flags[kStageCalibration] = 0;
    else base::LogPrintf("ASA_XCA from the auxiliary index: %s\n", files.xca.c_str());
  } else {
    require_existing(args[3]);
    if (kind.checkAuxTypes) check_aux_type(args[3], envisat::EnvisatTypes(args[3]).is_xca(), "ASA_XCA");
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
    if (kind.checkAuxTypes) check_aux_type(args[2], envisat::EnvisatTypes(args[2]).is_ins(), "ASA_INS");
    files.ins = args[2];
  }
  if (args[1] == kNotOK) base::fatal(base::ec::kBadArguments, {"DOR_VOR"});
  require_existing(args[1]);
  {
    const envisat::EnvisatTypes orbit(args[1]);
    if (!orbit.is_dorvor() && !orbit.is_dorpor()) base::fatal(base::ec::kBadArguments, {"DOR_VOR"});
  }

  std::vector<StripmapChannel> channels(static_cast<std::size_t>(images));
  for (int i = 0; i < images; ++i) {
    StripmapChannel& c = channels[static_cast<std::size_t>(i)];
    if (read_stripmap_parameters(parameterFile, c, flags, kind.polWeightsRequired) != 0)
      base::fatal(base::ec::kStageFailed, {std::string(kind.readparsDetail)});
    c.word = words[static_cast<std::size_t>(i)];
    const std::string slcPath = c.word.empty() ? args[4] + "_slc" : args[4] + "_" + c.word + "_slc";
    set_work_paths(c.par, slcPath, i, images);
  }
  files.level0 = args[0];
  files.orbit = args[1];
  {
    // The output root may name a folder the host has not made yet.
    const base::ErrnoGuard keep;
    std::error_code made;
    std::filesystem::create_directories(channels.front().par.outputDir, made);
  }
  flags[kStageCleanup] = 1;
  const bool incore = channels.front().proc.Flag_incore != 0;
  connect_stage_progress();

  // Channels: one extraction writes every image's lines, then each image runs the chain.
  const std::string processorDetail(kind.processorDetail);
  if (flags[kStageExtract]) {
    const StageClock clock("extraction");
    std::vector<sarpar> pars;
    for (const StripmapChannel& c : channels) pars.push_back(c.par);
    // The whole product, echoes only; the side tables live as long as the job.
    extconf extra;
    extra.extract_kind = envisat::kExtractEchoes;
    // With the scene in memory the raw lines go to range compression without a line file.
    extra.lines_in_memory = incore && flags[kStageRangeFocus] != 0;
    if (envi_extract(files, pars, extra) != 0)
      base::fatal(base::ec::kStageFailed, {processorDetail, failed_stage()});
    for (std::size_t i = 0; i < channels.size(); ++i) {
      channels[i].par = pars[i];
      if (i < extra.line_stores.size()) channels[i].proc.rawLines = std::move(extra.line_stores[i]);
    }
  }
  const QuickLookOptions quicklook{args[12] == "OK", std::atof(args[13].c_str()), quickLook1, quickLook2};
  const StageChain<StripmapChannel> chain = stripmap_chain(flags, files, incore, quicklook);
  for (std::size_t i = 0; i < channels.size(); ++i) {
    StripmapChannel& c = channels[i];
    if (images > 1) base::LogPrintf("Image %zu of %d: %s\n", i + 1, images, c.word.c_str());
    if (i > 0) {
      // The images of one product share one line grid: the first image's.
      c.proc.requiredLead = channels.front().proc.focusedLead;
      c.proc.requiredTrail = channels.front().proc.focusedTrail;
    }
    try {
      if (chain.run(c) != 0) base::fatal(base::ec::kStageFailed, {processorDetail, failed_stage()});
    } catch (const base::InputError& e) {
      fail_on_input(e, processorDetail, c.par);
    }

    // Products of this image, before the next starts: a failure on a later image leaves this
    // one finished.
    const StageClock clock("product files");
    const std::string headerPath = c.par.slcPath + "_hdr";
    if (write_stripmap_product(headerPath, c.par, c.proc, c.az, kind.annotation, std::string(kind.writeparsStage)) != 0) {
      // An SLC without its annotation cannot be used, and beside a half-written description it
      // would look like a product: take it all away.
      base::DeleteProductFile(c.par.slcPath, true);
      base::fatal(base::ec::kStageFailed, {std::string(kind.writeparsDetail), failed_stage()});
    }
    // Where the scene lies, for map tools; a product without it is still a product, so a failure
    // here is reported and the job goes on.
    hostlib::write_footprint(c.par.slcPath, hostlib::kFootprintAllFiles);
    errno = 0;
    // The next image needs the memory this one held.
    c.proc.matrix = dsp::cmatrix();
    c.proc.lineShifts = std::vector<int32_t>();
  }

  // Products: the quick-looks.
  if (args[12] == "OK") {
    const StageClock clock("quick-look");
    for (std::size_t i = 0; i < channels.size(); ++i) {
      const StripmapChannel& c = channels[i];
      const std::string_view label =
          i < kind.quicklookLabels.size() ? kind.quicklookLabels[i] : std::string_view("Tiff generation ...");
      base::SetActivityLabel(std::string(label));
      const std::string current = base::activity_label();
      base::getAndSetPerc(-1, 0, &current);
      base::getAndSetPerc(-1, 0, nullptr);
      if (write_quicklook(c.par.slcPath, c.par.slcPath + ".tif", std::atof(args[13].c_str()), quickLook1, quickLook2,
                          c.proc, &c.quicklook) != 0)
        base::fatal(base::ec::kStageFailed, {"GeoTIFF", failed_stage()});
    }
  }
  return 0;
}

}  // namespace sar::jobs

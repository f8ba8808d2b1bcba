// The wide swath job: a level 0 ASA_WS product through extraction and the burst chain to five
// focused sub-swath images with their headers, D/SS<s>.out and D/SS<s>.out.hdr beside the
// output root, then joined by the wide swath multilooker into one detected image R_pwr (slant
// range) or R_gr (ground range, argument 11 "OK") with its annotation and quick-look.
#include <algorithm>
#include <array>
#include <bit>
#include <cerrno>
#include <cmath>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <numbers>
#include <span>
#include <string>
#include <utility>
#include <vector>

#include "base/diagnostics.hpp"
#include "base/errors.hpp"
#include "base/profile.hpp"
#include "base/run_services.hpp"
#include "envisat/extract.hpp"
#include "envisat/product_types.hpp"
#include "envisat/replica_pattern.hpp"
#include "envisat/table_builder.hpp"
#include "geometry/doppler_geometry.hpp"
#include "jobs/annotation.hpp"
#include "jobs/aux_lookup.hpp"
#include "jobs/drivers.hpp"
#include "jobs/im_job.hpp"
#include "jobs/job_common.hpp"
#include "jobs/stage_chain.hpp"
#include "jobs/stages.hpp"
#include "jobs/ws_product.hpp"
#include "multilook/ws_multilook.hpp"
#include "multilook/wss_input.hpp"
#include "scansar/wide_swath.hpp"
#include "base/constants.hpp"

namespace sar::jobs {
namespace {

constexpr std::string_view kWsTitle = "Focussing ASAR WS";
constexpr std::string_view kWsBanner =
    "\nINPUT ASA_WS : [ %s ]\nINPUT DORIS : [ %s ]\nINPUT ASA_INS : [ %s ]\nINPUT ASA_XCA : [ %s ]\nINPUT "
    "ASA_XCH : [ %s ]\nOUTPUT ROOT NAME : [ %s ]";
constexpr std::string_view kWsParameterFile = "parameters_WS.hdr";
constexpr double kCarrier = 5.331e9;

// An auxiliary product: given and of its kind, or looked up in the index; the job cannot go on
// without any of the three.
std::string auxiliary(const std::string& arg, const std::string& product, const std::string& desDir, const char* kind,
                      bool (envisat::EnvisatTypes::*is)() const) {
  std::string path;
  if (arg == kNotOK) {
    if (find_aux(product, desDir, kind, path) != 0) {
      note_failed_stage("find_aux");
      base::fatal(base::ec::kStageFailed, {"find_aux()", std::string("no ") + kind + " covers the product"});
    }
    base::LogPrintf("%s from the auxiliary index: %s\n", kind, path.c_str());
    return path;
  }
  require_existing(arg);
  if (!(envisat::EnvisatTypes(arg).*is)()) base::fatal(base::ec::kBadArguments, {kind});
  return arg;
}

// The focused sub-swath D/SS<s>.out and its header moved to the multilook work names R + "ML" + s
// and R + "ML" + s + ".hdr" (an earlier file of that name removed first). False with `error`.
bool move_to_work_name(const std::string& dir, int s, const std::string& workName, std::string& error) {
  const std::string image = dir + "/SS" + std::to_string(s) + ".out";
  for (const auto& [from, to] : {std::pair{image, workName}, std::pair{image + ".hdr", workName + ".hdr"}}) {
    const base::ErrnoGuard keep;
    std::error_code ec;
    std::filesystem::remove(to, ec);
    std::filesystem::rename(from, to, ec);
    if (ec) {
      error = "cannot move " + from + " to " + to + ": " + ec.message();
      return false;
    }
  }
  return true;
}

// One focused sub-swath as the multilooker reads it, from its header beside it. False with
// `error` when the header or the image does not hold together.
bool focused_sub_swath(const std::string& image, int s, multilook::WsSubSwath& out, std::string& error) {
  const std::string header = image + ".hdr";
  int32_t samples[1] = {0}, prefix[1] = {0};
  double near[1] = {0.0}, incidence[1] = {0.0};
  std::array<double, 5> toGround{}, rate{};
  if (base::GetMyProfileIntArray("Image", "Samples", samples, header) != base::kProfileOk ||
      base::GetMyProfileIntArray("Image", "LinePrefixBytes", prefix, header) != base::kProfileOk ||
      base::GetProfileDoubleArray("Image", "NearRangeTime", near, header) != base::kProfileOk ||
      base::GetProfileDoubleArray("Doppler", "Incidence", incidence, header) != base::kProfileOk) {
    error = "the header " + header + " of the focused sub-swath SS" + std::to_string(s) + " is missing or incomplete";
    return false;
  }
  base::GetProfileDoubleArray("Doppler", "SlantToGround", toGround, header);
  base::GetProfileDoubleArray("Doppler", "Rate", rate, header);
  // The range window the burst chain put over the chirp band, for the looks' level.
  double window[1] = {1.0};
  base::GetProfileDoubleArray("General", "RangeWindowCoefficient", window, header);
  base::FreeProfile(header);
  std::error_code ec;
  const auto bytes = std::filesystem::file_size(image, ec);
  const int64_t pitch = prefix[0] + 8 * static_cast<int64_t>(samples[0]);
  if (ec || samples[0] < 1 || bytes == 0 || bytes % static_cast<uint64_t>(pitch) != 0) {
    error = "the focused sub-swath " + image + " does not hold whole lines of its header's " +
            std::to_string(samples[0]) + " samples";
    return false;
  }
  out.path = image;
  out.offset = 0;
  out.records = static_cast<int64_t>(bytes / static_cast<uint64_t>(pitch));
  out.rowPrefix = prefix[0];
  out.samples = samples[0];
  out.cellType = io::kFloatComplex;
  out.byteOrder = std::endian::native == std::endian::big ? io::kBigEndian : io::kLittleEndian;
  out.nearTime = near[0];
  // Near range incidence from the slope of ground range against two-way time, (c/2) / sin(theta):
  // the looks must reach the ground resolution there, where a slant cell is widest on the ground.
  out.incidence = incidence[0];
  if (toGround[1] > 149896229.0) out.incidence = std::asin(149896229.0 / toGround[1]) / base::kDegree;
  // The burst chain already placed each burst's lines around its beam centre, so the burst's
  // middle line is its centre: no centroid shift is to be added.
  out.centroid = 0.0;
  if (rate[0] < 0.0) out.rate = rate[0];
  if (window[0] > 0.0 && window[0] <= 1.0) out.rangeWindow = window[0];
  errno = 0;
  return true;
}

// The list for the host: "%s%d" of the output root and each sub-swath's number, one a line, in
// R + "ML.lst" (written whole under a temporary name, then renamed).
void write_swath_list(const std::string& root) {
  const std::string list = root + "ML.lst", part = list + ".part";
  {
    std::FILE* f = std::fopen(part.c_str(), "w");
    bool ok = f != nullptr;
    for (int s = 1; ok && s <= scansar::kSwaths; ++s) ok = std::fprintf(f, "%s%d\n", root.c_str(), s) > 0;
    if (f && std::fclose(f) != 0) ok = false;
    std::error_code ec;
    if (ok) std::filesystem::rename(part, list, ec);
    if (!ok || ec) {
      std::filesystem::remove(part, ec);
      base::report(base::kReportWarning, "cannot write the sub-swath list " + list);
    }
  }
  errno = 0;
}

int optional_ints(const char* section, const char* key, std::span<int32_t> out, const std::string& file) {
  return base::GetMyProfileIntArray(section, key, out, file);
}

}  // namespace

/// Section "Focusing_parameters" of parameters_WS.hdr into the burst chain's choices.
int WSreadpars(const std::string& file, scansar::wsparm& par) {
  base::Frame frame("WSreadpars_kelvor()");
  const char* s = "Focusing_parameters";
  auto number = [&](const char* key) {
    std::array<double, 1> v{};
    base::GetCheckMyProfileDoubleArray(s, key, v, file);
    return v[0];
  };
  par.azimuthStep = number("Azimuth_sampling_step");
  par.rangeHamming = number("Rg_win_hamm");
  par.rangeFilterLength = static_cast<int32_t>(number("Rg_win_len"));
  par.windowWidth1 = number("Az_win_width1");
  par.windowWidth2 = number("Az_win_width2");
  par.azimuthHamming = number("Az_burst_hamm_win");
  par.groundResolution = number("GR_resolution");
  int32_t compensate = 0;
  if (optional_ints(s, "CompensateAzimuthAntenna", std::span<int32_t>(&compensate, 1), file) == base::kProfileOk)
    par.compensateAntenna = compensate;
  // A Doppler granule holds half the bursts DC_Granule_Length gives.
  int32_t granule = 0;
  if (optional_ints(s, "DC_Granule_Length", std::span<int32_t>(&granule, 1), file) == base::kProfileOk && granule > 1)
    par.granuleLength = granule / 2;
  std::array<int32_t, 5> swaths{};
  if (optional_ints(s, "SwathsToProcess", swaths, file) == base::kProfileOk &&
      (swaths[0] | swaths[1] | swaths[2] | swaths[3] | swaths[4]) != 0)
    par.swathsToProcess = swaths;
  if (!(par.azimuthStep > 0.0) || par.rangeHamming <= 0.0 || par.rangeHamming > 1.0 || par.azimuthHamming <= 0.0 ||
      par.azimuthHamming > 1.0) {
    base::report(base::kReportError, "Focusing_parameters: azimuth step and Hamming coefficients out of range");
    return 10;
  }
  return 0;
}

namespace {

// The whole product runs through one chain: the Doppler estimate is joint over the sub-swaths,
// so the five are one channel here.
struct WsScene {
  std::string dir, level0, orbit, ins, xca, xch;
  std::vector<envisat::sarpar> channels;
  envisat::sarpar whole;  // the scene as one channel: the orbit and replica are sampled on it
  metadata::SceneReferences refs;
  scansar::scansar scan;
  scansar::wsparm par;
  bool ascending = false;
  bool extracted = false;
};

// Extraction: one line file a sub-swath, D/SS1 .. D/SS5, each holding its own bursts' echoes.
int extract_sub_swaths(WsScene& c) {
  c.channels.assign(scansar::kSwaths, envisat::sarpar{});
  for (int s = 0; s < scansar::kSwaths; ++s) {
    c.channels[static_cast<std::size_t>(s)].outputDir = c.dir;
    c.channels[static_cast<std::size_t>(s)].raw_file = c.dir + "/SS" + std::to_string(s + 1);
  }
  envisat::extconf extra;
  extra.skip_percent = 0;
  extra.extract_percent = 100;
  extra.extract_kind = envisat::kExtractEchoes;
  // The shared extraction stage: it also refuses a product shorter than its header says.
  envisat::enviauxfiles files;
  files.level0 = c.level0;
  files.ins = c.ins;
  files.extracted = c.xch;
  if (const int st = envi_extract(files, c.channels, extra); st != 0) return st;
  for (envisat::sarpar& ch : c.channels) ch.lines = ch.burst_count * ch.burst_echoes;
  c.extracted = true;
  return 0;
}

// The orbit over the whole scene; the pass direction from the Earth-fixed z velocity at the
// scene's middle state vector.
int scene_orbit(WsScene& c) {
  c.whole = c.channels[0];
  c.whole.lines = std::max(1, static_cast<int>(std::lround(c.scan.bursts * c.scan.cycleTime * c.whole.prf)));
  if (const int st = envisat::envi_orbit(c.orbit, c.whole, c.refs); st != 0) return st;
  c.ascending = c.refs.orbitVelocities[3 * 2 + 2] > 0.0;
  return 0;
}

// The two-way elevation pattern of each sub-swath, from its beam slot.
int elevation_patterns(WsScene& c) {
  for (int s = 0; s < scansar::kSwaths; ++s) {
    scansar::ElevationPattern& e = c.par.elevation[static_cast<std::size_t>(s)];
    double reference = 0.0;
    if (const int st = envisat::envi_slot_pattern(c.xca, c.ins, scansar::kBeamSlot[static_cast<std::size_t>(s)],
                                                  c.channels[0].polarization_type, e.amplitude, reference);
        st != 0)
      return st;
    e.reference = reference * std::numbers::pi / 180.0;
  }
  return 0;
}

// The burst chain in two stages: range focusing with the Doppler estimate, whose results
// D/doppler.par keeps, then azimuth focusing from them. The burst chain times its own phases.
int burst_chain(WsScene& c, bool rangeDoppler) {
  const std::string orbitPath = c.orbit;
  const scansar::GeometricCentroid geometric = [orbitPath](const metadata::SceneReferences&, double t, double tau,
                                                           double wavelength) {
    double fdc = 0.0;
    const geometry::PointingLaw law;
    if (geometry::EstDopplerENVI(orbitPath, t, tau, 1.0, 10.0, wavelength, law.p_deg, law.q_deg, law.r_deg, law.s_deg,
                                 law.a_rad, fdc) != 0)
      return 0.0;
    return fdc;
  };
  scansar::WsStages stages;
  stages.rangeDoppler = rangeDoppler;
  stages.azimuth = !rangeDoppler;
  return scansar::WSprocessor(c.dir, c.channels, c.refs, c.par, stages, c.ascending, geometric);
}

StageChain<WsScene> ws_chain() {
  using C = WsScene;
  StageChain<C> chain;
  chain.then("envi_extract", "extraction", extract_sub_swaths)
      .then("geometry", "", [](C& c) { return scansar::derive_geometry(c.channels, c.scan); })
      .then("envi_orbit", "references", scene_orbit)
      .then("envi_syntchirp", "references", [](C& c) { return envisat::envi_syntchirp(c.whole, c.refs); })
      .then("envi_beam_corr", "references", elevation_patterns)
      .then("WSrangeFOC", "", [](C& c) { return burst_chain(c, true); })
      .then("WSazFOC", "", [](C& c) { return burst_chain(c, false); });
  return chain;
}

}  // namespace

int main_focussing_asar_ws_v2(const std::string& listPath) {
  const std::vector<std::string> args = start_job(listPath, kWsTitle, kWsBanner, {0, 1, 2, 3, 7, 4});
  const std::string desDir = description_dir();

  if (args[0] == kNotOK) base::fatal(base::ec::kBadArguments, {"ASA_WS0"});
  require_existing(args[0]);
  if (!envisat::EnvisatTypes(args[0]).is_ws0()) base::fatal(base::ec::kBadArguments, {"ASA_WS0"});
  const std::string xca = auxiliary(args[3], args[0], desDir, "ASA_XCA", &envisat::EnvisatTypes::is_xca);
  const std::string xch = auxiliary(args[7], args[0], desDir, "ASA_XCH", &envisat::EnvisatTypes::is_xch);
  const std::string ins = auxiliary(args[2], args[0], desDir, "ASA_INS", &envisat::EnvisatTypes::is_ins);
  if (args[1] == kNotOK) base::fatal(base::ec::kBadArguments, {"DOR_VOR"});
  require_existing(args[1]);
  {
    const envisat::EnvisatTypes orbit(args[1]);
    if (!orbit.is_dorvor() && !orbit.is_dorpor()) base::fatal(base::ec::kBadArguments, {"DOR_VOR"});
  }

  scansar::wsparm par;
  if (WSreadpars(desDir + std::string(kWsParameterFile), par) != 0)
    base::fatal(base::ec::kStageFailed, {"WSreadpars_kelvor()"});
  base::LogPrintf("ASA INS File : %s\n", ins.c_str());
  base::LogPrintf("ASA XCA File : %s\n", xca.c_str());
  base::LogPrintf("ASA XCH File : %s\n", xch.c_str());
  // Arguments 8 and 9: the first and last burst to focus (0: from the first, to the last).
  par.firstBurst = std::max(1, std::atoi(args[8].c_str()));
  par.lastBurst = std::atoi(args[9].c_str());

  const std::string dir = directory_of(args[4]);
  {
    const base::ErrnoGuard keep;
    std::error_code made;
    std::filesystem::create_directories(dir, made);
  }
  connect_stage_progress();

  WsScene scene;
  scene.dir = dir;
  scene.level0 = args[0];
  scene.orbit = args[1];
  scene.ins = ins;
  scene.xca = xca;
  scene.xch = xch;
  scene.par = par;
  const StageChain<WsScene> chain = ws_chain();
  try {
    if (chain.run(scene) != 0) base::fatal(base::ec::kStageFailed, {"WSprocessor()", failed_stage()});
  } catch (const base::InputError& e) {
    // The extraction's own refusals go up as they are, as in every job.
    if (!scene.extracted) throw;
    fail_on_input(e, "WSprocessor()", scene.whole);
  }
  par = scene.par;
  const std::vector<envisat::sarpar>& channels = scene.channels;
  const scansar::scansar& scan = scene.scan;
  for (int s = 0; s < scansar::kSwaths; ++s)
    if (par.swathsToProcess[static_cast<std::size_t>(s)])
      base::LogPrintf("SS%d: %s/SS%d.out, lines %d to %d\n", s + 1, dir.c_str(), s + 1, par.firstLine[static_cast<std::size_t>(s)],
                      par.lastLine[static_cast<std::size_t>(s)]);

  // The five sub-swaths joined into one detected image.
  multilook::WsMultilookConfig cfg;
  const int deleteTemporary = read_ws_multilook_config(desDir + "parameters_multilook.hdr", cfg);
  if (args[11] == "OK") cfg.groundRange = 1;
  cfg.lineStep = par.azimuthStep;
  cfg.samplingRate = scan.samplingRate;
  // One range band for all: the narrowest chirp, which every sub-swath's spectrum covers.
  cfg.rangeBand = *std::min_element(scan.chirpBandwidth.begin(), scan.chirpBandwidth.end());
  // Work names of the multilook: the root + "ML", and per sub-swath the root + "ML" + s, under
  // which each focused sub-swath is read; they go once the image and its annotation stand.
  const std::string workName = args[4] + "ML";
  std::array<std::string, scansar::kSwaths> swathWorkNames;
  for (int s = 0; s < scansar::kSwaths; ++s) swathWorkNames[static_cast<std::size_t>(s)] = workName + std::to_string(s + 1);
  std::array<multilook::WsSubSwath, scansar::kSwaths> swaths;
  std::string error;
  for (int s = 0; s < scansar::kSwaths && error.empty(); ++s) {
    const std::string& name = swathWorkNames[static_cast<std::size_t>(s)];
    if (!par.swathsToProcess[static_cast<std::size_t>(s)])
      error = "the multilook joins all five sub-swaths; SS" + std::to_string(s + 1) + " was not focused";
    else if (move_to_work_name(dir, s + 1, name, error))
      focused_sub_swath(name, s + 1, swaths[static_cast<std::size_t>(s)], error);
  }
  if (!error.empty()) {
    base::report(base::kReportError, error);
    note_failed_stage("mlook::readimages");
    base::fatal(base::ec::kStageFailed, {"readimages()", error});
  }
  const std::string output = args[4] + (cfg.groundRange ? "_gr" : "_pwr");
  double earliest = 1e300, latest = -1e300;
  for (std::size_t s = 0; s < scansar::kSwaths; ++s) {
    earliest = std::min(earliest, par.earliestTime[s]);
    latest = std::max(latest, par.latestTime[s]);
  }
  multilook::SlcGrid orbit;
  const double carrier = scan.carrierFrequency > 0.0 ? scan.carrierFrequency : kCarrier;
  if (multilook::orbit_geometry(args[1], 0.5 * (earliest + latest), carrier, orbit, error) != 0) {
    base::report(base::kReportError, error);
    note_failed_stage("mlook::run");
    base::fatal(base::ec::kStageFailed, {"run()", error});
  }
  multilook::WsMultilookResult res;
  base::SetActivityLabel("WS Multilooking ...");
  {
    const StageClock clock("multilook");
    if (multilook::run_ws_multilook(swaths, cfg, orbit, output, res) != 0) {
      note_failed_stage("mlook::run");
      base::fatal(base::ec::kStageFailed, {"run()", res.error});
    }
  }
  base::LogPrintf("Multilooked %s: %d samples, %d lines, %d range looks\n", output.c_str(), res.samples, res.lines,
                  res.rangeLooks);

  WsProductInfo info;
  info.origin = "ENVISAT_WS";
  info.polarisation = std::string(polarisation_text(channels[0].polarization_type));
  info.farTime = swaths[4].nearTime + swaths[4].samples / scan.samplingRate;
  info.quickLook = args[12] == "OK";
  info.quickLookScale = std::atof(args[13].c_str());
  finish_ws_product(output, res, orbit, cfg.groundRange != 0, info);

  // The work files, once the joined image stands (DeleteTempFile 0 keeps them to look at): the
  // extracted sub-swaths and the focused ones under their work names. The host is told the
  // output root with each sub-swath's number, one a line.
  if (deleteTemporary) {
    for (int s = 1; s <= scansar::kSwaths; ++s) {
      base::DeleteProductFile(dir + "/SS" + std::to_string(s), false);
      base::DeleteProductFile(swathWorkNames[static_cast<std::size_t>(s - 1)], false);
      base::DeleteProductFile(swathWorkNames[static_cast<std::size_t>(s - 1)] + ".hdr", false);
    }
  }
  write_swath_list(args[4]);
  errno = 0;
  return 0;
}

}  // namespace sar::jobs

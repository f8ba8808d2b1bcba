// The wide swath job: a level 0 ASA_WS product through extraction and the burst chain to five
// focused sub-swath images with their headers, D/SS<s>.out and D/SS<s>.out.hdr beside the
// output root. Joining them into one image is the multilooker's step, which comes after.
#include <chrono>
#include <cmath>
#include <cstdlib>
#include <filesystem>
#include <span>
#include <string>
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
#include "jobs/aux_lookup.hpp"
#include "jobs/drivers.hpp"
#include "jobs/im_job.hpp"
#include "jobs/job_common.hpp"
#include "jobs/stages.hpp"
#include "scansar/wide_swath.hpp"

namespace sar::jobs {
namespace {

constexpr std::string_view kWsTitle = "Focussing ASAR WS";
constexpr std::string_view kWsBanner =
    "\nINPUT ASA_WS : [ %s ]\nINPUT DORIS : [ %s ]\nINPUT ASA_INS : [ %s ]\nINPUT ASA_XCA : [ %s ]\nINPUT "
    "ASA_XCH : [ %s ]\nOUTPUT ROOT NAME : [ %s ]";
constexpr std::string_view kWsParameterFile = "parameters_WS.hdr";
constexpr double kSpeedOfLight = 299792458.0;
// Yaw-steering law of the platform for the orbit's centroid: p, q, r, s (degrees).
constexpr double kLaw[4] = {3.912987, -0.167074, 0.050233, 23.0};

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

  // Extraction: one line file a sub-swath, D/SS1 .. D/SS5.
  std::vector<envisat::sarpar> channels(scansar::kSwaths);
  for (int s = 0; s < scansar::kSwaths; ++s) {
    channels[static_cast<std::size_t>(s)].outputDir = dir;
    channels[static_cast<std::size_t>(s)].raw_file = dir + "/SS" + std::to_string(s + 1);
  }
  envisat::extconf extra;
  extra.skip_percent = 0;
  extra.extract_percent = 100;
  extra.extract_kind = envisat::kExtractEchoes;
  {
    const auto start = std::chrono::steady_clock::now();
    // The shared extraction stage: it also refuses a product shorter than its header says.
    envisat::enviauxfiles files;
    files.level0 = args[0];
    files.ins = ins;
    files.extracted = xch;
    if (envi_extract(files, channels, extra) != 0) base::fatal(base::ec::kStageFailed, {"WSprocessor()", "envi_extract"});
    base::LogPrintf("Stage time %-14s %9.2f s\n", "extraction",
                    std::chrono::duration<double>(std::chrono::steady_clock::now() - start).count());
  }
  // Each sub-swath file holds its own bursts' echoes.
  for (envisat::sarpar& c : channels) c.lines = c.burst_count * c.burst_echoes;

  // The orbit over the whole scene and the nominal replica (the five sub-swaths share the pulse).
  metadata::SceneReferences refs;
  envisat::sarpar whole = channels[0];
  scansar::scansar scan;
  if (scansar::derive_geometry(channels, scan) != 0) base::fatal(base::ec::kStageFailed, {"WSprocessor()", "geometry"});
  whole.lines = std::max(1, static_cast<int>(std::lround(scan.bursts * scan.cycleTime * whole.prf)));
  try {
    if (envisat::envi_orbit(args[1], whole, refs) != 0)
      base::fatal(base::ec::kStageFailed, {"WSprocessor()", "envi_orbit"});
  } catch (const base::InputError& e) {
    note_failed_stage("envi_orbit");
    fail_on_input(e, "WSprocessor()", whole);
  }
  if (envisat::envi_syntchirp(whole, refs) != 0) base::fatal(base::ec::kStageFailed, {"WSprocessor()", "envi_syntchirp"});
  // The pass direction from the Earth-fixed z velocity at the scene's middle state vector.
  const bool ascending = refs.orbitVelocities[3 * 2 + 2] > 0.0;

  const std::string orbitPath = args[1];
  const scansar::GeometricCentroid geometric = [orbitPath](const metadata::SceneReferences&, double t, double tau,
                                                           double wavelength) {
    double fdc = 0.0;
    if (geometry::EstDopplerENVI(orbitPath, t, tau, 1.0, 10.0, wavelength, kLaw[0], kLaw[1], kLaw[2], kLaw[3], 0.0, fdc) != 0)
      return 0.0;
    return fdc;
  };
  scansar::WsStages stages;
  if (scansar::WSprocessor(dir, channels, refs, par, stages, ascending, geometric) != 0) {
    if (failed_stage().empty()) note_failed_stage("WSprocessor");
    base::fatal(base::ec::kStageFailed, {"WSprocessor()", failed_stage()});
  }
  for (int s = 0; s < scansar::kSwaths; ++s)
    if (par.swathsToProcess[static_cast<std::size_t>(s)])
      base::LogPrintf("SS%d: %s/SS%d.out, lines %d to %d\n", s + 1, dir.c_str(), s + 1, par.firstLine[static_cast<std::size_t>(s)],
                      par.lastLine[static_cast<std::size_t>(s)]);
  (void)kSpeedOfLight;
  return 0;
}

}  // namespace sar::jobs

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
#include "jobs/ws_product.hpp"
#include "multilook/wss_input.hpp"
#include "multilook/ws_multilook.hpp"
#include "base/constants.hpp"

namespace sar::jobs {

namespace {

constexpr const char* kWssParameterFile = "parameters_multilook.hdr";
constexpr double kCarrier = 5.331e9;
constexpr double kLightSpeed = base::kSpeedOfLight;
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

  multilook::WsMultilookConfig cfg;
  read_ws_multilook_config(parameterFile, cfg);
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

  WsProductInfo info;
  info.origin = "ENVISAT_WSS";
  info.polarisation = product.polarisation1;
  info.azimuthSpacing = product.azimuthSpacing;
  info.farTime = swaths[4].nearTime + swaths[4].samples * (res.slantStep / res.decimation);
  info.quickLook = args[12] == "OK";
  info.quickLookScale = std::atof(args[13].c_str());
  finish_ws_product(output, res, orbit, cfg.groundRange != 0, info);
  return 0;
}

}  // namespace sar::jobs

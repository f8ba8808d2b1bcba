// The alternating polarisation job: two images, one per polarisation of the product's
// sub-mode, each focused as a continuous stripmap on the IM chain. Each image's line file is
// zero on the other polarisation's blocks, so an image holds half the energy of an IM scene
// and grating lobes PRF^2 / (2 L Ka) lines either side of every response (L echoes a block);
// the annotation suggests enough azimuth looks to average them away.
#include "base/errors.hpp"
#include "envisat/level0_format.hpp"
#include "envisat/product_types.hpp"
#include "jobs/drivers.hpp"
#include "jobs/stripmap_job.hpp"

namespace sar::jobs {
namespace {

constexpr int kApSuggestedAzimuthLooks = 7;

// Output words of a sub-mode's two images, in image order.
std::vector<std::string> words_of(int mode) {
  switch (mode) {
    case envisat::kModeAPH: return {"hv", "hh"};
    case envisat::kModeAPV: return {"vv", "vh"};
    case envisat::kModeAPC: return {"vv", "hh"};
    default: base::fatal(base::ec::kBadArguments, {"ASA_AP0"});
  }
}

}  // namespace

/// The images of an alternating polarisation level 0 product: by its name's sub-mode, or, for
/// the archive's "ASA_AP__0P" names, by the mode identifier of its first clean packet.
std::vector<std::string> ap_images(const std::string& level0Path) {
  const envisat::EnvisatTypes type(level0Path);
  if (type.is_aph()) return words_of(envisat::kModeAPH);
  if (type.is_apv()) return words_of(envisat::kModeAPV);
  if (type.is_apc()) return words_of(envisat::kModeAPC);
  const auto name = type.product_name();
  if (name && name->starts_with(envisat::kGenericApPrefix)) {
    const int mode = envisat::alternating_mode_of_packets(level0Path);
    if (!envisat::is_alternating(mode))
      base::fatal(base::ec::kBadArguments,
                  {"ASA_AP0", level0Path, "no packet of the product names an alternating polarisation sub-mode"});
    return words_of(mode);
  }
  base::fatal(base::ec::kBadArguments, {"ASA_AP0"});
}

StripmapJobKind ap_job_kind() {
  StripmapJobKind kind;
  kind.title = "Focussing ASAR AP";
  kind.banner =
      "\nINPUT ASA_AP : [ %s ]\nINPUT DORIS : [ %s ]\nINPUT ASA_INS : [ %s ]\nINPUT ASA_XCA : [ %s ]\nOUTPUT ROOT "
      "NAME : [ %s ]";
  kind.productDetail = "ASA_AP0";
  kind.parameterFile = "parameters_AP.hdr";
  kind.readparsDetail = "APreadpars_kelvor()";
  kind.processorDetail = "APprocessor()";
  kind.writeparsDetail = "APwritepars_kelvor()";
  kind.writeparsStage = "APwritepars";
  kind.polWeightsRequired = false;
  kind.checkAuxTypes = true;
  kind.annotation.originData = "ENVISAT_AP0";
  kind.annotation.sceneDataPrefix = "ENVISAT-1|ENVISAT_AP0|";
  kind.annotation.writePrfExtracted = false;
  kind.annotation.minimumAzimuthLooks = kApSuggestedAzimuthLooks;
  kind.annotation.reportOldHeaderRemoval = true;
  kind.images = ap_images;
  kind.quicklookLabels = {"Tiff generation first image ...", "Tiff generation second image ..."};
  return kind;
}

int main_focussing_asar_ap(const std::string& listPath) { return run_stripmap_job(listPath, ap_job_kind()); }

}  // namespace sar::jobs

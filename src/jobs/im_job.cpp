#include "jobs/im_job.hpp"

#include "base/errors.hpp"
#include "envisat/product_types.hpp"
#include "jobs/drivers.hpp"

namespace sar::jobs {

StripmapJobKind im_job_kind() {
  StripmapJobKind kind;
  kind.title = kImTitle;
  kind.banner =
      "\nINPUT ASA_IM : [ %s ]\nINPUT DORIS : [ %s ]\nINPUT ASA_INS : [ %s ]\nINPUT ASA_XCA : [ %s ]\nOUTPUT ROOT "
      "NAME : [ %s ]";
  kind.productDetail = "ASA_IM0";
  kind.parameterFile = kImParameterFile;
  kind.readparsDetail = "IMreadpars_kelvor()";
  kind.processorDetail = "IMprocessor()";
  kind.writeparsDetail = "IMwritepars_kelvor()";
  kind.writeparsStage = "IMwritepars";
  kind.polWeightsRequired = true;
  kind.images = [](const std::string& level0Path) -> std::vector<std::string> {
    if (!envisat::EnvisatTypes(level0Path).is_im0()) base::fatal(base::ec::kBadArguments, {"ASA_IM0"});
    return {""};
  };
  kind.quicklookLabels = {"Tiff generation ..."};
  return kind;
}

int main_focussing_asar_im(const std::string& listPath) { return run_stripmap_job(listPath, im_job_kind()); }

}  // namespace sar::jobs

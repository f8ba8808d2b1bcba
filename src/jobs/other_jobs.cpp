// Drivers of the modes whose processing chains come after the IM chain. Each reads and checks
// its list like the IM job and then stops at its first stage with the stage-failure code.
#include "base/errors.hpp"
#include "jobs/drivers.hpp"
#include "jobs/job_common.hpp"
#include "jobs/stages.hpp"

namespace sar::jobs {
namespace {

[[noreturn]] void stop_at(std::string_view stage, const char* detail) {
  stage_not_built(stage);
  base::fatal(base::ec::kStageFailed, {detail, std::string(stage)});
}

}  // namespace

int main_focussing_asar_ap(const std::string& listPath) {
  start_job(listPath, "Focussing ASAR AP",
            "\nINPUT ASA_AP : [ %s ]\nINPUT DORIS : [ %s ]\nINPUT ASA_INS : [ %s ]\nINPUT ASA_XCA : [ %s ]\nOUTPUT "
            "ROOT NAME : [ %s ]",
            {0, 1, 2, 3, 4});
  stop_at("APprocessor", "APprocessor()");
}

}  // namespace sar::jobs

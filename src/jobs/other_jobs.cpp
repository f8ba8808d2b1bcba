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

int main_focussing_asar_ws_v2(const std::string& listPath) {
  start_job(listPath, "Focussing ASAR WS",
            "\nINPUT ASA_WS : [ %s ]\nINPUT DORIS : [ %s ]\nINPUT ASA_INS : [ %s ]\nINPUT ASA_XCA : [ %s ]\nINPUT "
            "ASA_XCH : [ %s ]\nOUTPUT ROOT NAME : [ %s ]",
            {0, 1, 2, 3, 7, 4});
  stop_at("WSprocessor", "WSprocessor()");
}

}  // namespace sar::jobs

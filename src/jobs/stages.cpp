#include "jobs/stages.hpp"

#include "base/diagnostics.hpp"
#include "base/run_services.hpp"

namespace sar::jobs {
namespace {
std::string& failed() {
  static std::string name;
  return name;
}
}  // namespace

const std::string& failed_stage() { return failed(); }
void note_failed_stage(std::string_view name) { failed() = std::string(name); }

int stage_not_built(std::string_view name) {
  note_failed_stage(name);
  const std::string text = std::string(name) + ": stage not available in this build";
  base::report(base::kReportError, text);
  return kStageRejected;
}

// Stages still to come. Each later stage replaces its line here with the real call.
int envi_extract(const enviauxfiles&, sarpar&) { return stage_not_built("envi_extract"); }
int envi_orbit(const std::string&, sarpar&, procparm&) { return stage_not_built("envi_orbit"); }
int envi_rgpattern(const std::string&, const std::string&, sarpar&, procparm&) {
  return stage_not_built("envi_rgpattern");
}
int envi_syntchirp(sarpar&, procparm&) { return stage_not_built("envi_syntchirp"); }
int init_buffer(sarpar&, procparm&) { return stage_not_built("init_buffer"); }
int rangefoc(sarpar&, procparm&) { return stage_not_built("rangefoc"); }
int EstDopplerENVI(const std::string&, double, double, double, double, double, double, double, double, double,
                   procparm&) {
  return stage_not_built("EstDopplerENVI");
}
int getnadcpoly(const std::string&, dcestconf&, procparm&) { return stage_not_built("getnadcpoly"); }
int getgeopoly(sarpar&, procparm&) { return stage_not_built("getgeopoly"); }
int IMCalibration(sarpar&, procparm&) { return stage_not_built("IMCalibration"); }
int azimuthfoc(sarpar&, procparm&, azimuthconf&) { return stage_not_built("azimuthfoc"); }
int dest_buffer(sarpar&, procparm&) { return stage_not_built("dest_buffer"); }
int get_coords(procparm&, sarpar&) { return stage_not_built("get_coords"); }
int IMwritepars(const std::string&, const sarpar&, const procparm&, const enviauxfiles&) {
  return stage_not_built("IMwritepars");
}
}  // namespace sar::jobs

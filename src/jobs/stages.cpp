#include "jobs/stages.hpp"

#include <vector>

#include "base/convert.hpp"
#include "base/diagnostics.hpp"
#include "base/run_services.hpp"
#include "envisat/extract.hpp"
#include "envisat/replica_pattern.hpp"
#include "envisat/table_builder.hpp"
#include "stripmap/azimuth_focus.hpp"
#include "stripmap/coords.hpp"
#include "stripmap/progress.hpp"
#include "stripmap/range_focus.hpp"

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

int envi_extract(const enviauxfiles& files, sarpar& par, extconf& extra) {
  base::Frame frame("envi_extract");
  std::vector<sarpar> channels{par};
  const int st = envisat::envi_extract(files.level0, files.ins, files.extracted, channels, extra,
                                       envisat::timeline_table_builder());
  if (st != 0) {
    note_failed_stage("envi_extract");
    return frame.check(st);
  }
  // Stripmap jobs hold one channel; the record keeps the job's paths and takes the rest.
  par = channels.front();
  std::string first;
  if (base::sec852myascii(par.azimuthStartTime, first) != 0) first = "(no time)";
  base::LogPrintf("EXTR: %d lines of %d samples from %s\n", par.lines, par.samples, first.substr(0, 27).c_str());
  return 0;
}

void connect_stage_progress() {
  stripmap::stage_progress().open = [](std::string_view label) { base::waitbar_open(label); };
  stripmap::stage_progress().update = [](double percent) { base::waitbar_update(percent); };
}

namespace {
int named(std::string_view stage, int status) {
  if (status != 0) note_failed_stage(stage);
  return status;
}
}  // namespace

int envi_orbit(const std::string& orbitPath, sarpar& par, procparm& proc) {
  return named("envi_orbit", envisat::envi_orbit(orbitPath, par, proc));
}
int envi_rgpattern(const std::string& xcaPath, const std::string& insPath, sarpar& par, procparm& proc) {
  return named("envi_rgpattern", envisat::envi_rgpattern(xcaPath, insPath, par, proc));
}
int envi_syntchirp(sarpar& par, procparm& proc) { return named("envi_syntchirp", envisat::envi_syntchirp(par, proc)); }

// Stages still to come. Each later stage replaces its line here with the real call.
int init_buffer(sarpar& par, procparm& proc) { return named("init_buffer", stripmap::init_buffer(par, proc)); }
int rangefoc(sarpar& par, procparm& proc) { return named("rangefoc", stripmap::rangefoc(par, proc)); }
int EstDopplerENVI(const std::string&, double, double, double, double, double, double, double, double, double,
                   procparm&) {
  return stage_not_built("EstDopplerENVI");
}
int getnadcpoly(const std::string&, dcestconf&, procparm&) { return stage_not_built("getnadcpoly"); }
int getgeopoly(sarpar&, procparm&) { return stage_not_built("getgeopoly"); }
int IMCalibration(sarpar&, procparm&) { return stage_not_built("IMCalibration"); }
int azimuthfoc(sarpar& par, procparm& proc, azimuthconf& az) {
  return named("azimuthfoc", stripmap::azimuthfoc(par, proc, az));
}
int dest_buffer(sarpar& par, procparm& proc) { return named("dest_buffer", stripmap::dest_buffer(par, proc)); }
int get_coords(procparm& proc, sarpar& par) { return named("get_coords", stripmap::get_coords(proc, par)); }
int IMwritepars(const std::string&, const sarpar&, const procparm&, const enviauxfiles&) {
  return stage_not_built("IMwritepars");
}
}  // namespace sar::jobs

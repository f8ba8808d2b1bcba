// The wide swath processor: the burst chain over the selected sub-swaths, stage by stage.
#include <filesystem>
#include <string>

#include "base/diagnostics.hpp"
#include "base/run_services.hpp"
#include "base/stage_clock.hpp"
#include "geometry/geolocation.hpp"
#include "scansar/wide_swath.hpp"
#include "base/constants.hpp"

namespace sar::scansar {
using base::StageClock;

namespace {
// Corners of a focused sub-swath: the zero-Doppler ground points of its earliest and latest
// line at its near and far column, and of its middle.
SceneCorners get_coords(const scansar& scan, const wsparm& par, const RangeFocused& f,
                        const metadata::SceneReferences& refs, int s) {
  const auto i = static_cast<std::size_t>(s);
  SceneCorners out;
  geometry::grpt_rec rec = geometry::zero_doppler_record(refs.orbitPositions, refs.orbitStartTime, refs.orbitSpacing,
                                                         base::kSpeedOfLight / scan.carrierFrequency);
  const int32_t ov = par.rangeOverlap;
  const double near = f.nearTime + (f.firstValid + ov / 2) / scan.samplingRate;
  const double far = near + (f.validColumns - ov - 1) / scan.samplingRate;
  const double first = par.earliestTime[i], last = par.latestTime[i];
  auto point = [&](double t, double tau, std::array<double, 2>& latLon) {
    rec.azimuth_time = t;
    rec.tau = tau;
    if (geometry::gr_pt_lat_lon(rec) != 0) return false;
    latLon = {rec.latitude, rec.longitude};
    return true;
  };
  out.valid = refs.orbitSpacing > 0.0 && last >= first && point(first, near, out.firstNear) &&
              point(first, far, out.firstFar) && point(last, near, out.lastNear) && point(last, far, out.lastFar) &&
              point(0.5 * (first + last), 0.5 * (near + far), out.centre);
  return out;
}
}  // namespace

int WSprocessor(const std::string& dir, std::span<const sarpar> channels, const metadata::SceneReferences& refs,
                wsparm& par, const WsStages& stages, bool ascending, const GeometricCentroid& geometric) {
  base::Frame frame("WSprocessor");
  scansar scan;
  if (const int st = derive_geometry(channels, scan); st != 0) return frame.check(st);
  if (const int st = check_bursts(scan, par); st != 0) return st;
  base::LogPrintf("Wide swath: %d bursts a sub-swath, cycle %.6f s, firing order %d %d %d %d %d\n", scan.bursts,
                  scan.cycleTime, scan.order[0] + 1, scan.order[1] + 1, scan.order[2] + 1, scan.order[3] + 1,
                  scan.order[4] + 1);
  const std::string dopplerFile = dir + "/doppler.par";
  std::array<RangeFocused, kSwaths> focused{};
  DopplerEstimate est;
  if (stages.rangeDoppler) {
    std::array<CorrelationSums, kSwaths> sums{};
    {
    const StageClock clock("range");
    for (int s = 0; s < kSwaths; ++s) {
      if (!par.swathsToProcess[static_cast<std::size_t>(s)]) continue;
      base::LogPrintf("Range focusing sub-swath %d\n", s + 1);
      const auto i = static_cast<std::size_t>(s);
      if (const int st = burst_range_focus(dir, s, channels[i], scan, par, refs.replica, focused[i], sums[i]); st != 0)
        return frame.check(st);
    }
    }
    const StageClock clock("Doppler");
    if (const int st = burst_doppler(scan, par, refs, focused, sums, est, geometric); st != 0) return frame.check(st);
    if (const int st = save_doppler(dopplerFile, est, focused); st != 0) return frame.check(st);
  }
  // The estimates as the file holds them, so that a run resumed from it focuses alike.
  if (stages.azimuth) {
    if (const int st = load_doppler(dopplerFile, est, focused); st != 0) return frame.check(st);
  }
  if (!stages.azimuth) return 0;
  base::LogPrintf("Starting AZFOC\n");
  const StageClock clock("azimuth");
  for (int s = 0; s < kSwaths; ++s) {
    const auto i = static_cast<std::size_t>(s);
    if (!par.swathsToProcess[i]) continue;
    if (const int st = burst_azimuth_focus(dir, s, scan, par, est, focused[i]); st != 0) return frame.check(st);
    par.corners[i] = get_coords(scan, par, focused[i], refs, s);
    if (!par.corners[i].valid) base::report(base::kReportWarning, "SS" + std::to_string(s + 1) + ": no corner coordinates from the orbit");
    const std::string out = dir + "/SS" + std::to_string(s + 1) + ".out";
    if (const int st = write_WShdr(out + ".hdr", s, scan, par, est, focused[i], ascending); st != 0)
      return frame.check(st);
    if (stages.deleteTemporary) {
      std::error_code err;
      if (!std::filesystem::remove(dir + "/rgfoc_ss" + std::to_string(s + 1), err))
        base::report(base::kReportWarning, "Cannot remove file");
    }
  }
  base::LogPrintf("Ending AZFOC\n");
  return 0;
}

}  // namespace sar::scansar

// The wide swath processor: the burst chain over the selected sub-swaths, stage by stage.
#include <filesystem>
#include <string>

#include "base/diagnostics.hpp"
#include "base/run_services.hpp"
#include "base/stage_clock.hpp"
#include "scansar/wide_swath.hpp"

namespace sar::scansar {
using base::StageClock;

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

#pragma once
// The skeleton every job shares: its inputs are resolved first, then each channel (the image
// of IM or RADARSAT, each polarisation of AP, each sub-swath of WS) runs through a chain of
// named stages, then the products are written.
//
// A chain is built once per job and run once per channel. A stage returns 0 or a failure
// status; the first failure stops the chain, and its name becomes the failed stage that the
// driver puts into the host's error record. Stages may also throw (input errors, the fatal
// exit); the chain does not catch, so that the driver alone decides what the host is told.
// Consecutive stages of one phase ("extraction", "range", "Doppler", "azimuth") are timed
// together, into the log, so an operator sees where a slow run spent its time.
#include <functional>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "base/diagnostics.hpp"
#include "base/stage_clock.hpp"
#include "jobs/stages.hpp"
#include "stripmap/raster_files.hpp"

namespace sar::jobs {

/// The phase clock of the jobs: raster writes apart from the phase's own work.
class StageClock : public base::StageClock {
 public:
  explicit StageClock(std::string phase, bool writing = false)
      : base::StageClock(std::move(phase), &stripmap::output_write_seconds, writing) {}
};

template <class Channel>
class StageChain {
 public:
  using Run = std::function<int(Channel&)>;

  struct Stage {
    std::string name;   // the failed-stage name when it fails
    std::string phase;  // the clock it runs under; empty: untimed
    Run run;
    bool writing = false;  // the phase's own work is writing rasters
  };

  /// Appends a stage; `on` false leaves it out (a stage flag that is off).
  StageChain& then(std::string name, std::string phase, Run run, bool on = true, bool writing = false) {
    if (on) stages_.push_back({std::move(name), std::move(phase), std::move(run), writing});
    return *this;
  }

  /// Runs every stage in order on `channel`. 0, or the status of the first stage that failed,
  /// whose name is then the job's failed stage (unless the stage noted a finer one).
  int run(Channel& channel) const {
    std::size_t i = 0;
    while (i < stages_.size()) {
      const std::string& phase = stages_[i].phase;
      std::size_t end = i + 1;
      while (end < stages_.size() && !phase.empty() && stages_[end].phase == phase) ++end;
      std::optional<StageClock> clock;
      if (!phase.empty()) clock.emplace(phase, stages_[i].writing);
      for (; i < end; ++i) {
        int st = 0;
        try {
          st = stages_[i].run(channel);
        } catch (...) {
          // The driver reports what was thrown; the record names the stage it came from.
          if (failed_stage().empty()) note_failed_stage(stages_[i].name);
          throw;
        }
        if (st != 0) {
          if (failed_stage().empty()) note_failed_stage(stages_[i].name);
          return st;
        }
      }
    }
    return 0;
  }

  /// Stage names in order, for the log and the tests.
  std::vector<std::string> names() const {
    std::vector<std::string> out;
    for (const Stage& s : stages_) out.push_back(s.name);
    return out;
  }

 private:
  std::vector<Stage> stages_;
};

}  // namespace sar::jobs

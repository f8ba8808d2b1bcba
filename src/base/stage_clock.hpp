#pragma once
// Wall time of one phase of a job into the log ("Stage time <phase> <seconds> s"), so that an
// operator sees where a slow run spent it. Given a counter of the seconds spent writing rasters,
// a phase that is not itself writing reports those writes on a line of their own.
#include <chrono>
#include <string>
#include <utility>

#include "base/run_services.hpp"

namespace sar::base {

class StageClock {
 public:
  using Seconds = double (*)();

  explicit StageClock(std::string phase, Seconds writeSeconds = nullptr, bool writingPhase = false)
      : phase_(std::move(phase)),
        writeSeconds_(writeSeconds),
        writingPhase_(writingPhase),
        writing_(writeSeconds ? writeSeconds() : 0.0) {}
  StageClock(const StageClock&) = delete;
  StageClock& operator=(const StageClock&) = delete;
  ~StageClock() {
    const double total = std::chrono::duration<double>(std::chrono::steady_clock::now() - start_).count();
    const double writing = writeSeconds_ ? writeSeconds_() - writing_ : 0.0;
    if (writing > 0.0 && !writingPhase_) {
      LogPrintf("Stage time %-14s %9.2f s\n", phase_.c_str(), total - writing);
      LogPrintf("Stage time %-14s %9.2f s\n", "raster writes", writing);
    } else {
      LogPrintf("Stage time %-14s %9.2f s\n", phase_.c_str(), total);
    }
  }

 private:
  std::string phase_;
  Seconds writeSeconds_;
  bool writingPhase_;
  double writing_;
  std::chrono::steady_clock::time_point start_ = std::chrono::steady_clock::now();
};

}  // namespace sar::base

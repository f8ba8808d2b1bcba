#pragma once
// Progress of the focusing stages. The stages name their activity and report percentages; the
// job decides where that goes (the host's progress bar), and library callers without a host
// leave it silent.
#include <functional>
#include <string_view>

namespace sar::stripmap {

struct StageProgress {
  std::function<void(std::string_view)> open;  // a new activity, bar at 0
  std::function<void(double)> update;          // percent of the activity
};

/// The process-wide sink the stages report to; empty members: no reporting.
inline StageProgress& stage_progress() {
  static StageProgress sink;
  return sink;
}
inline void progress_open(std::string_view label) {
  if (stage_progress().open) stage_progress().open(label);
}
inline void progress_update(double percent) {
  if (stage_progress().update) stage_progress().update(percent);
}

}  // namespace sar::stripmap

#pragma once
// Expected target positions: from the command line, from a plain list, or from the truth file
// of a simulated product, and their mapping onto an image whose grid starts elsewhere.
#include <string>
#include <string_view>
#include <vector>

#include "analyser/irf.hpp"

namespace sar::analyser {

struct ExpectedTarget {
  std::string name;
  double line = 0.0;
  double sample = 0.0;
};

/// Image position = given position + offset. A focused image whose line 0 is raw line L0 and
/// whose sample 0 is raw sample S0 takes the offsets -L0 and -S0.
struct TargetMapping {
  double line_offset = 0.0;
  double sample_offset = 0.0;
};

struct TruthTargets {
  std::vector<ExpectedTarget> targets;  ///< target_N: azimuth_line, range_sample; named "target_N"
  double range_spacing_m = kNaN;        ///< slant range sample spacing c / (2 sampling_frequency)
};

/// Reads the [target_N] sections (N = 1, 2, ... until one is missing) of a truth file.
/// Throws std::runtime_error for a missing file, a file without targets or a bad number.
TruthTargets read_truth_targets(const std::string& path);

/// Reads a list of "LINE SAMPLE [NAME]" lines (blanks or commas between fields; '#' starts a
/// comment). Unnamed targets are called "target_K" by their rank. Throws std::runtime_error
/// naming the line of a bad entry.
std::vector<ExpectedTarget> read_target_list(const std::string& path);

/// "LINE,SAMPLE": false for anything else (both numbers finite).
bool parse_position(std::string_view text, double& line, double& sample);

/// A strict number: the whole text, finite.
bool parse_number(std::string_view text, double& value);

void apply_mapping(std::vector<ExpectedTarget>& targets, const TargetMapping& mapping);

}  // namespace sar::analyser

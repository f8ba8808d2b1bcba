#pragma once
// Process entry: recognise the mode from the command string, run its driver, and turn the
// outcome into the host's files and the exit status.
#include <span>
#include <string>
#include <string_view>

namespace sar::jobs {

inline constexpr std::string_view kUnitEntry = "focussing_entry";

struct ModePrefix {
  std::string_view prefix;
  int modeCode;
  int (*driver)(const std::string&);
  std::string_view driverName;
};

/// The mode prefixes in the order they are tested.
std::span<const ModePrefix> mode_prefixes();

/// Index into mode_prefixes() of the prefix that the command string starts with, or -1.
int match_mode(std::string_view command);

/// Run one job for a command string; returns the process exit status.
int focussing_entry(std::string command);

}  // namespace sar::jobs

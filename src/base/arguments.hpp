#pragma once
// Argument list files: one argument a line, read the way the host writes them.
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace sar::base {

inline constexpr std::string_view kHostSeparator = "###Vanterra###";
/// Longest line the list reader accepts; a longer line ends the reading.
inline constexpr std::size_t kMaxListLine = 259;

/// Cut a command string or list path at the host separator.
std::string cut_at_host_separator(std::string_view text);

/// Read an argument list. Each line is cut at its first carriage return and, with `trim`,
/// trimmed of blanks; a line beginning with '#' ends the list; an empty line is an argument; a
/// line longer than 259 characters ends the reading before it. When the file is missing, its
/// bare name is looked up in the working directory; failing that, 261122 with the name.
std::vector<std::string> ReadArgumentList(const std::string& listName, bool trim);

/// The job's arguments: the list named by `listPath` (cut at the host separator) without its
/// first line. Fewer than 2 lines raise 261122 with the list path.
std::vector<std::string> GetJobArguments(std::string_view listPath);

}  // namespace sar::base

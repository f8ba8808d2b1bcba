#pragma once
// Strict number parsing of header texts: the whole text (blanks around it aside) must be one
// number, otherwise there is no value. Header files come from outside the process, so nothing
// here trusts its input.
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace sar::metadata {

/// Decimal integer with optional sign, surrounded by optional blanks, tabs, CR or LF.
std::optional<int64_t> parse_int(std::string_view text);
/// Decimal or scientific number, "nan" and "inf" included; overflow to infinity is refused.
std::optional<double> parse_real(std::string_view text);
/// Tokens of a list separated by commas and white space ("1, 2, 3, " gives three tokens).
std::vector<std::string> split_list(std::string_view text);

}  // namespace sar::metadata

#include "metadata/text_number.hpp"

#include <cerrno>
#include <cmath>
#include <cstdlib>

namespace sar::metadata {

namespace {

bool is_blank(char c) { return c == ' ' || c == '\t' || c == '\r' || c == '\n'; }

std::string_view trim(std::string_view s) {
  while (!s.empty() && is_blank(s.front())) s.remove_prefix(1);
  while (!s.empty() && is_blank(s.back())) s.remove_suffix(1);
  return s;
}

}  // namespace

std::optional<int64_t> parse_int(std::string_view text) {
  const std::string s(trim(text));
  if (s.empty()) return std::nullopt;
  const size_t digits_at = (s[0] == '-' || s[0] == '+') ? 1 : 0;
  if (digits_at >= s.size() || s[digits_at] < '0' || s[digits_at] > '9') return std::nullopt;
  errno = 0;
  char* end = nullptr;
  const long long v = std::strtoll(s.c_str(), &end, 10);
  const bool overflow = errno == ERANGE;
  errno = 0;
  if (overflow || end != s.c_str() + s.size()) return std::nullopt;
  return static_cast<int64_t>(v);
}

std::optional<double> parse_real(std::string_view text) {
  const std::string s(trim(text));
  if (s.empty()) return std::nullopt;
  errno = 0;
  char* end = nullptr;
  const double v = std::strtod(s.c_str(), &end);
  const bool range = errno == ERANGE;
  errno = 0;
  if (end != s.c_str() + s.size()) return std::nullopt;
  // Underflow to a subnormal or zero is a value; overflow is not.
  if (range && std::isinf(v)) return std::nullopt;
  return v;
}

std::vector<std::string> split_list(std::string_view text) {
  std::vector<std::string> out;
  std::string token;
  for (char c : text) {
    if (c == ',' || is_blank(c)) {
      if (!token.empty()) out.push_back(std::move(token));
      token.clear();
    } else {
      token.push_back(c);
    }
  }
  if (!token.empty()) out.push_back(std::move(token));
  return out;
}

}  // namespace sar::metadata

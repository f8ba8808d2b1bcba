#pragma once
// The caller's file and line for reports and raised errors. std::source_location where the
// compiler gives it; clang 14 (the fuzzing compiler) lacks the builtin that libstdc++ 12 needs,
// so there the same three values come from the older location builtins.
#include <cstdint>
#include <version>

#if defined(__cpp_lib_source_location)
#include <source_location>
#endif

namespace sar::base {

#if defined(__cpp_lib_source_location)
using source_location = std::source_location;
#else
class source_location {
 public:
  static constexpr source_location current(const char* file = __builtin_FILE(), const char* function = __builtin_FUNCTION(),
                                           std::uint_least32_t line = __builtin_LINE()) noexcept {
    source_location loc;
    loc.file_ = file;
    loc.function_ = function;
    loc.line_ = line;
    return loc;
  }
  constexpr const char* file_name() const noexcept { return file_; }
  constexpr const char* function_name() const noexcept { return function_; }
  constexpr std::uint_least32_t line() const noexcept { return line_; }
  constexpr std::uint_least32_t column() const noexcept { return 0; }

 private:
  const char* file_ = "";
  const char* function_ = "";
  std::uint_least32_t line_ = 0;
};
#endif

}  // namespace sar::base

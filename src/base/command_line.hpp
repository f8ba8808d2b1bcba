#pragma once
// The command lines of the engine's programs (sarfocus, focussing --setup, the simulator and the
// analyser) on CLI11, in one style: help texts laid out alike from the options themselves, and a
// refusal as one line "<program>: <option> <problem>; see <program> --help".
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include <CLI/CLI.hpp>

namespace sar::base::cli {

/// Help in the house layout: "usage: <usage>", the description, the positionals and options
/// with their texts in one column, then the footer. Options of the group "" stay out of it.
class HelpFormatter : public CLI::Formatter {
 public:
  explicit HelpFormatter(std::string usage) : usage_(std::move(usage)) {}
  std::string make_help(const CLI::App* app, std::string name, CLI::AppFormatMode mode) const override;

 private:
  std::string usage_;
};

/// A program's command line: the usage line of its help (without "usage: ") and its
/// description; a -h/--help flag whose text is "this text".
std::unique_ptr<CLI::App> make_app(const std::string& program, const std::string& usage,
                                   const std::string& description = {});

/// A value text shown after the option's name in the help ("N", "FILE", "WxH").
inline CLI::Option* shown_as(CLI::Option* option, const std::string& text) { return option->option_text(" " + text); }

/// Whole number from lo to hi, as text; the message names what was given.
CLI::Validator whole_number(long long lo, long long hi);
/// Any finite number.
CLI::Validator real_number();
/// `count` finite numbers separated by commas; `form` names them ("LAT,LON,H,AMP").
CLI::Validator number_list(std::size_t count, const std::string& form);
/// The numbers of a text `number_list` accepted.
std::vector<double> numbers_of(const std::string& text);
/// One of the words.
CLI::Validator one_of(std::vector<std::string> words);

struct Parsed {
  bool help = false;
  std::string error;  // empty when the command line was accepted
  std::vector<std::string> extras;  // words no option or positional took (only with allow_extras)
};

/// Parses `args` (without the program name) in order. Errors come back as one line in the
/// house wording ("--orbit needs a value", "unknown option --bogus", "--threads takes ...").
/// When `app` allows extras, words it did not take are returned instead of refused.
Parsed parse(CLI::App& app, const std::vector<std::string>& args);

/// Same over main's arguments.
Parsed parse(CLI::App& app, int argc, const char* const* argv);

/// A tool's main: parses, prints the help (status 0) or the refusal "program: <error>; see
/// program --help" (status 2) and returns that status; nothing when the line was accepted.
std::optional<int> parse_main(CLI::App& app, int argc, const char* const* argv, const std::string& program);

}  // namespace sar::base::cli

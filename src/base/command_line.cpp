#include "base/command_line.hpp"

#include <charconv>
#include <cmath>
#include <cstdio>
#include <iomanip>
#include <sstream>

namespace sar::base::cli {

namespace {

constexpr std::size_t kNameColumn = 23;  // where the option texts start

void put_entry(std::ostringstream& out, const std::string& name, const std::string& text) {
  std::string head = "  " + name;
  out << head;
  if (text.empty()) {
    out << '\n';
    return;
  }
  if (head.size() + 1 > kNameColumn) out << '\n' << std::string(kNameColumn, ' ');
  else out << std::string(kNameColumn - head.size(), ' ');
  for (char c : text) {
    out << c;
    if (c == '\n') out << std::string(kNameColumn, ' ');
  }
  out << '\n';
}

std::string option_names(const CLI::Option* o) {
  std::string names;
  for (const auto& s : o->get_snames()) names += (names.empty() ? "-" : ", -") + s;
  for (const auto& l : o->get_lnames()) names += (names.empty() ? "--" : ", --") + l;
  return names + o->get_option_text();
}

}  // namespace

std::string HelpFormatter::make_help(const CLI::App* app, std::string, CLI::AppFormatMode) const {
  std::ostringstream out;
  out << "usage: " << usage_ << '\n';
  if (!app->get_description().empty()) out << app->get_description() << '\n';
  const auto positionals = app->get_options([](const CLI::Option* o) { return o->get_positional() && !o->get_group().empty(); });
  for (const CLI::Option* o : positionals) {
    const std::string shown = o->get_option_text();
    put_entry(out, shown.empty() ? o->get_name(true) : shown.substr(1), o->get_description());
  }
  const auto options = app->get_options([](const CLI::Option* o) { return o->nonpositional() && !o->get_group().empty(); });
  if (!options.empty()) out << "options:\n";
  for (const CLI::Option* o : options) put_entry(out, option_names(o), o->get_description());
  if (!app->get_footer().empty()) out << '\n' << app->get_footer();
  std::string text = out.str();
  if (text.back() != '\n') text += '\n';
  return text;
}

std::unique_ptr<CLI::App> make_app(const std::string& program, const std::string& usage,
                                   const std::string& description) {
  auto app = std::make_unique<CLI::App>(description, program);
  app->formatter(std::make_shared<HelpFormatter>(usage));
  app->set_help_flag("-h,--help", "this text");
  // An option given twice takes its last value, as shell scripts that append to a command expect.
  app->option_defaults()->multi_option_policy(CLI::MultiOptionPolicy::TakeLast);
  return app;
}

CLI::Validator whole_number(long long lo, long long hi) {
  return CLI::Validator(
      [lo, hi](std::string& text) -> std::string {
        long long v = 0;
        const auto [end, ec] = std::from_chars(text.data(), text.data() + text.size(), v);
        if (text.empty() || ec != std::errc() || end != text.data() + text.size() || v < lo || v > hi)
          return "takes a whole number from " + std::to_string(lo) + " to " + std::to_string(hi) + ", not '" + text + "'";
        return {};
      },
      "N");
}

CLI::Validator real_number() {
  return CLI::Validator(
      [](std::string& text) -> std::string {
        double v = 0.0;
        const auto [end, ec] = std::from_chars(text.data(), text.data() + text.size(), v);
        if (text.empty() || ec != std::errc() || end != text.data() + text.size() || !std::isfinite(v))
          return "takes a number, not '" + text + "'";
        return {};
      },
      "X");
}

std::vector<double> numbers_of(const std::string& text) {
  std::vector<double> values;
  std::size_t start = 0;
  for (;;) {
    const std::size_t comma = text.find(',', start);
    const std::string part = text.substr(start, comma == std::string::npos ? std::string::npos : comma - start);
    double v = 0.0;
    const auto [end, ec] = std::from_chars(part.data(), part.data() + part.size(), v);
    if (part.empty() || ec != std::errc() || end != part.data() + part.size() || !std::isfinite(v)) return {};
    values.push_back(v);
    if (comma == std::string::npos) return values;
    start = comma + 1;
  }
}

CLI::Validator number_list(std::size_t count, const std::string& form) {
  return CLI::Validator(
      [count, form](std::string& text) -> std::string {
        return numbers_of(text).size() == count ? std::string() : "takes " + form + ", not '" + text + "'";
      },
      form);
}

CLI::Validator one_of(std::vector<std::string> words) {
  std::string list;
  for (std::size_t i = 0; i < words.size(); ++i)
    list += (i == 0 ? "" : i + 1 == words.size() ? " or " : ", ") + words[i];
  return CLI::Validator(
      [words, list](std::string& text) -> std::string {
        for (const auto& w : words)
          if (text == w) return {};
        return "takes " + list + ", not '" + text + "'";
      },
      list);
}

Parsed parse(CLI::App& app, const std::vector<std::string>& args) {
  Parsed result;
  std::vector<std::string> reversed(args.rbegin(), args.rend());  // CLI11 takes the words last first
  // Words nobody takes are refused here, in the house wording, not by CLI11.
  const bool allowExtras = app.get_allow_extras();
  app.allow_extras(true);
  struct Restore {
    CLI::App& app;
    bool allow;
    ~Restore() { app.allow_extras(allow); }
  } restore{app, allowExtras};
  try {
    app.parse(reversed);
  } catch (const CLI::CallForHelp&) {
    result.help = true;
    return result;
  } catch (const CLI::ArgumentMismatch& e) {
    // CLI11 says "--orbit: 1 required TEXT missing"; the option's name comes first.
    const std::string what = e.what();
    result.error = what.find("missing") != std::string::npos ? what.substr(0, what.find(':')) + " needs a value" : what;
    return result;
  } catch (const CLI::ValidationError& e) {
    // "<option>: <what the validator said>" reads as one sentence without the colon.
    std::string what = e.what();
    if (const auto colon = what.find(": "); colon != std::string::npos) what.erase(colon, 1);
    result.error = what;
    return result;
  } catch (const CLI::ParseError& e) {
    result.error = e.what();
    return result;
  }
  result.extras = app.remaining();
  if (!allowExtras && !result.extras.empty()) {
    const std::string& w = result.extras.front();
    result.error = !w.empty() && w[0] == '-' ? "unknown option " + w : "unexpected argument '" + w + "'";
  }
  return result;
}

Parsed parse(CLI::App& app, int argc, const char* const* argv) {
  return parse(app, std::vector<std::string>(argv + 1, argv + argc));
}

std::optional<int> parse_main(CLI::App& app, int argc, const char* const* argv, const std::string& program) {
  const Parsed parsed = parse(app, argc, argv);
  if (parsed.help) {
    std::fputs(app.help().c_str(), stdout);
    return 0;
  }
  if (!parsed.error.empty()) {
    std::fprintf(stderr, "%s: %s; see %s --help\n", program.c_str(), parsed.error.c_str(), program.c_str());
    return 2;
  }
  return std::nullopt;
}

}  // namespace sar::base::cli

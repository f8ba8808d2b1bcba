// The shared command-line layer: refusals in one wording, last-wins and repeatable options,
// extras handed back, and the help layout built from the options.
#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "base/command_line.hpp"

namespace cli = sar::base::cli;

namespace {

struct Values {
  int count = 0;
  std::vector<std::string> items;
  std::string word = "a";
  std::string position;
  std::string product;
  bool flag = false;
};

std::unique_ptr<CLI::App> app_for(Values& v, bool extras = false) {
  auto app = cli::make_app("prog", "prog PRODUCT [options]", "Does one thing.");
  app->add_option("PRODUCT", v.product, "the input");
  cli::shown_as(app->add_option("--count", v.count, "how many")->check(cli::whole_number(1, 9)), "N");
  cli::shown_as(app->add_option("--item", v.items, "an item, repeatable")->allow_extra_args(false), "TEXT");
  cli::shown_as(app->add_option("--word", v.word, "a word\nof two lines")->check(cli::one_of({"a", "b", "c"})), "W");
  cli::shown_as(app->add_option("--at", v.position, "a position")->check(cli::number_list(2, "LINE,SAMPLE")),
                "LINE,SAMPLE");
  app->add_flag("--flag", v.flag, "a switch");
  app->footer("Exit status: 0.\n");
  if (extras) app->allow_extras();
  return app;
}

}  // namespace

TEST(CommandLine, RefusalsNameTheOptionAndWhatWasGiven) {
  const std::vector<std::pair<std::vector<std::string>, std::string>> cases = {
      {{"p", "--count", "0"}, "--count takes a whole number from 1 to 9, not '0'"},
      {{"p", "--count", "3x"}, "--count takes a whole number from 1 to 9, not '3x'"},
      {{"p", "--count="}, "--count needs a value"},
      {{"p", "--word", "d"}, "--word takes a, b or c, not 'd'"},
      {{"p", "--at", "1"}, "--at takes LINE,SAMPLE, not '1'"},
      {{"p", "--at", "1,inf"}, "--at takes LINE,SAMPLE, not '1,inf'"},
      {{"p", "--count"}, "--count needs a value"},
      {{"p", "--bogus"}, "unknown option --bogus"},
      {{"p", "q"}, "unexpected argument 'q'"},
  };
  for (const auto& [args, says] : cases) {
    Values v;
    const auto app = app_for(v);
    const cli::Parsed r = cli::parse(*app, args);
    EXPECT_FALSE(r.help);
    EXPECT_EQ(r.error, says) << args.back();
  }
}

TEST(CommandLine, LastValueWinsRepeatableOptionsCollectAndExtrasComeBack) {
  Values v;
  auto app = app_for(v, true);
  cli::Parsed r = cli::parse(*app, {"--count", "2", "--item", "x", "p.N1", "--item=y", "--count=5", "--flag", "--bogus",
                                    "q.N1", "--at", "-1.5,2e3"});
  EXPECT_EQ(r.error, "");
  EXPECT_EQ(v.count, 5);
  EXPECT_EQ(v.items, (std::vector<std::string>{"x", "y"}));
  EXPECT_EQ(v.product, "p.N1");
  EXPECT_TRUE(v.flag);
  EXPECT_EQ(r.extras, (std::vector<std::string>{"--bogus", "q.N1"}));
  EXPECT_EQ(cli::numbers_of(v.position), (std::vector<double>{-1.5, 2000.0}));
  EXPECT_TRUE(cli::numbers_of("1,,2").empty());

  Values w;
  app = app_for(w);
  r = cli::parse(*app, {"p", "-h"});
  EXPECT_TRUE(r.help);
}

TEST(CommandLine, HelpListsEveryOptionInOneColumn) {
  Values v;
  const auto app = app_for(v);
  const std::string help = app->help();
  const std::string expected =
      "usage: prog PRODUCT [options]\n"
      "Does one thing.\n"
      "  PRODUCT              the input\n"
      "options:\n"
      "  -h, --help           this text\n"
      "  --count N            how many\n"
      "  --item TEXT          an item, repeatable\n"
      "  --word W             a word\n"
      "                       of two lines\n"
      "  --at LINE,SAMPLE     a position\n"
      "  --flag               a switch\n"
      "\n"
      "Exit status: 0.\n";
  EXPECT_EQ(help, expected);
}

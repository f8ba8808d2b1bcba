// The sarfocus command line: help and version, option parsing, and the one-line refusals of
// bad input that leave nothing behind in the output folder.
#include <gtest/gtest.h>
#include <sys/stat.h>

#include "base/run_services.hpp"
#include "test_standalone_support.hpp"

using namespace sar::test;
using namespace sar::jobs;

TEST(SarfocusCli, HelpOfEveryCommandIsCompleteAndVersionIsTheEngines) {
  const CliResult overview = sarfocus({"--help"});
  EXPECT_EQ(overview.status, 0);
  for (const char* word : {"sarfocus MODE PRODUCT", "sarfocus batch", "--version", "Exit status"})
    EXPECT_NE(overview.out.find(word), std::string::npos) << word;

  const std::vector<std::string> modeOptions = {"--orbit", "--aux", "--out", "--quicklook", "--no-quicklook",
                                                "--threads", "--param", "--params", "--trace", "--skip-complete"};
  const std::vector<std::string> batchOptions = {"--mode", "--jobs", "--force", "--emit slurm", "--emit parallel",
                                                 "--sshlogin", "--slurm-option", "--job-name", "sarfocus.complete"};
  for (const std::string topic : {"im", "ap", "ws", "rs", "wss", "batch"}) {
    EXPECT_NE(overview.out.find(topic == "batch" ? "sarfocus batch " : "  " + topic + " "), std::string::npos) << topic;
    const CliResult a = sarfocus({"help", topic});
    const CliResult b = sarfocus({topic, "--help"});
    EXPECT_EQ(a.status, 0) << topic;
    EXPECT_EQ(b.status, 0) << topic;
    EXPECT_EQ(a.out, b.out) << topic;
    EXPECT_NE(a.out.find("usage: sarfocus " + topic), std::string::npos) << topic;
    for (const auto& o : topic == "batch" ? batchOptions : modeOptions)
      EXPECT_NE(a.out.find(o), std::string::npos) << topic << " lacks " << o;
  }
  EXPECT_EQ(sarfocus({"help", "nonsense"}).status, 2);
  const CliResult none = sarfocus({});
  EXPECT_EQ(none.status, 2);
  EXPECT_EQ(none.err, overview.out);

  const CliResult version = sarfocus({"--version"});
  EXPECT_EQ(version.status, 0);
  EXPECT_EQ(version.out, std::string(sar::base::kVersionText) + "\n");
}

TEST(SarfocusCli, OptionsRoundTripAndBadOnesAreNamed) {
  StandaloneRequest r;
  r.product = "/p/x.N1";
  r.orbit = "/o";
  r.auxDir = "/a b";
  r.outDir = "/out";
  r.quickLookWidth = 300;
  r.quickLookHeight = 200;
  r.threads = 3;
  r.params = {"Azblk=1000", "AzimuthConf.StoltPadding=0.2"};
  r.paramsFile = "/p.ini";
  r.tracing = r.skipComplete = true;
  std::vector<std::string> args = {"im", r.product};
  for (const auto& o : standalone_options(r)) args.push_back(o);
  StandaloneRequest back;
  bool help = true;
  ASSERT_EQ(parse_standalone_options(args, 1, back, help), "");
  EXPECT_FALSE(help);
  EXPECT_EQ(standalone_options(back), standalone_options(r));
  EXPECT_EQ(back.product, r.product);
  StandaloneRequest other;
  EXPECT_EQ(parse_standalone_options({"x.N1", "--out=/o2", "--no-quicklook"}, 0, other, help), "");
  EXPECT_EQ(other.outDir, "/o2");
  EXPECT_FALSE(other.quickLook);
  // The quick-look options count in the order given; a repeated option keeps its last value.
  StandaloneRequest order;
  EXPECT_EQ(parse_standalone_options({"x.N1", "--quicklook", "300x200", "--no-quicklook", "--out", "/a", "--out=/b"}, 0,
                                     order, help),
            "");
  EXPECT_FALSE(order.quickLook);
  EXPECT_EQ(order.outDir, "/b");
  order = {};
  EXPECT_EQ(parse_standalone_options({"--no-quicklook", "--quicklook=30x20", "x.N1"}, 0, order, help), "");
  EXPECT_TRUE(order.quickLook);
  EXPECT_EQ(order.quickLookWidth, 30);
  EXPECT_EQ(order.quickLookHeight, 20);
  EXPECT_EQ(order.product, "x.N1");
  EXPECT_EQ(parse_standalone_options({"x.N1", "--help"}, 0, order, help), "");
  EXPECT_TRUE(help);

  const std::vector<std::pair<std::vector<std::string>, std::string>> bad = {
      {{"--threads", "0"}, "--threads"},      {{"--threads", "2x"}, "--threads"},
      {{"--quicklook", "12"}, "WxH"},         {{"--quicklook", "0x5"}, "--quicklook"},
      {{"--param", "Azblk"}, "KEY=VALUE"},    {{"--orbit"}, "--orbit needs a value"},
      {{"--bogus"}, "unknown option --bogus"}, {{"a.N1", "b.N1"}, "one product only"}};
  for (const auto& [words, says] : bad) {
    StandaloneRequest q;
    const std::string e = parse_standalone_options(words, 0, q, help);
    EXPECT_NE(e.find(says), std::string::npos) << words[0] << ": " << e;
  }
}

TEST(SarfocusCli, BadInputGivesOneLineAndLeavesTheOutputFolderAlone) {
  ScratchJob job("sarfocus_bad");
  const fs::path out = job.dir() / "out";
  const fs::path readOnly = job.dir() / "ro";
  fs::create_directories(readOnly);
  ::chmod(readOnly.c_str(), 0555);
  struct Case {
    std::vector<std::string> args;
    const char* says;
    fs::path folder;  // must stay absent or empty
  };
  const std::string o = out.string();
  const Case cases[] = {
      {{"im", "/nowhere/x.N1", "--out", o}, "product not found: /nowhere/x.N1", out},
      {{"xx", kIm0, "--out", o}, "unknown mode 'xx'", out},
      {{"im", kIm0, "--orbit", kReal.string(), "--out", o}, "sensing start 29-MAR-2012 07:11:34", out},
      {{"im", kIm0, "--orbit", "/nowhere/orbits", "--out", o}, "orbit not found", out},
      {{"im", kIm0, "--aux", "/nowhere/aux", "--out", o}, "auxiliary folder not found", out},
      {{"im", kIm0, "--param", "NoSuchKey=1", "--out", o}, "no key 'NoSuchKey'", out},
      {{"im", kIm0, "--out", readOnly.string()}, "is not writable", readOnly},
      {{"im", kIm0, "--out", (readOnly / "a" / "b").string()}, "is not writable", readOnly},
      {{"im", kIm0, "--out", kIm0 + "/sub"}, "is not writable", out},
      {{"batch", "/nowhere/list.txt", "--out", o}, "not found: /nowhere/list.txt", out},
      {{"batch", kIm0, "--out", o}, "is a product, not a list", out},
      {{"batch", kReal.string(), "--out", readOnly.string()}, "is not writable", readOnly},
      {{"batch", kReal.string(), "--jobs", "0"}, "--jobs", out},
      {{"batch", kReal.string(), "--emit", "pbs"}, "--emit takes slurm or parallel", out},
  };
  for (const Case& c : cases) {
    const CliResult r = sarfocus(c.args);
    EXPECT_EQ(r.status, 2) << c.says << ": " << r.err;
    EXPECT_NE(r.err.find(c.says), std::string::npos) << r.err;
    EXPECT_EQ(count_lines(r.err), 1u) << r.err;
    EXPECT_TRUE(!fs::exists(c.folder) || fs::is_empty(c.folder)) << c.says;
  }
}

TEST(SarfocusCli, ModesRunThroughFocussingAndSayWhenNotBuilt) {
  ScratchJob job("sarfocus_modes");
  const fs::path out = job.dir() / "out";
  for (const std::string mode : {"ap", "ws", "rs", "wss"}) {
    const CliResult r = sarfocus({mode, kIm0, "--out", out.string()});
    EXPECT_NE(r.status, 0) << mode;
    // Progress lines may come first; the outcome is the one line of sarfocus itself.
    EXPECT_EQ(r.err.find("sarfocus:"), r.err.rfind("sarfocus:")) << r.err;
    if (r.status == kExitNotBuilt) {
      // The job ran and stopped at its first stage: nothing stays behind.
      EXPECT_NE(r.err.find("sarfocus: mode '" + mode + "' is not available in this build yet: the job stopped at "),
                std::string::npos)
          << r.err;
      EXPECT_TRUE(!fs::exists(out) || fs::is_empty(out)) << mode;
    } else {
      // A built chain refuses an image mode product with its error record.
      EXPECT_NE(r.err.find("sarfocus: FAILED: "), std::string::npos) << mode << ": " << r.err;
    }
  }
}

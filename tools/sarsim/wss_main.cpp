// sarsim wss: a simulated ASA_WSS_1P product (see simulator/wss_product.hpp).
//
//   sarsim wss --out DIR [--orbit FILE] [--time "dd-MMM-yyyy hh:mm:ss.uuuuuu"] [--samples N]
//              [--bursts K] [--burst-lines L] [--cycle-lines C] [--target SWATH,LINE,SAMPLE,AMP]...
//              [--seed S] [--fault truncated|drop-swath=D]
//
// The orbit defaults to the real DOR_VOR of the sample archive, which covers 01-MAR-2008 21:55
// to 03-MAR-2008 00:23; the default start time lies inside it.
#include <cmath>
#include <cstdio>
#include <exception>
#include <string>
#include <vector>

#include "base/command_line.hpp"
#include "simulator/wss_product.hpp"

int wss_main(int argc, char** argv, const std::string& defaultOrbit) {
  namespace cli = sar::base::cli;
  sar::simulator::WssConfig c;
  c.orbit_path = defaultOrbit;
  std::vector<std::string> targets;
  std::string fault;
  constexpr long long kMaxCount = 100000000;

  const auto app = cli::make_app("sarsim wss", "sarsim wss --out DIR [options]",
                                 "A simulated ASA_WSS_1P level 1 product of five sub-swaths; its path and the orbit's are\n"
                                 "printed, one a line.");
  cli::shown_as(app->add_option("--out", c.out_dir, "output folder (required)")->required(), "DIR");
  cli::shown_as(app->add_option("--orbit", c.orbit_path,
                                "ENVISAT orbit product (default: the sample archive's DOR_VOR, which\n"
                                "covers 01-MAR-2008 21:55 to 03-MAR-2008 00:23)"),
                "FILE");
  cli::shown_as(app->add_option("--time", c.start_time, "time of the first line (default 02-MAR-2008 10:00:00.000000)"),
                "\"dd-MMM-yyyy hh:mm:ss.uuuuuu\"");
  cli::shown_as(app->add_option("--samples", c.samples, "samples of a sub-swath (default 320)")
                    ->check(cli::whole_number(1, kMaxCount)),
                "N");
  cli::shown_as(app->add_option("--bursts", c.bursts, "bursts of a sub-swath (default 6)")
                    ->check(cli::whole_number(1, kMaxCount)),
                "K");
  cli::shown_as(app->add_option("--burst-lines", c.burst_lines, "focused lines of a burst (default 320)")
                    ->check(cli::whole_number(1, kMaxCount)),
                "L");
  cli::shown_as(app->add_option("--cycle-lines", c.cycle_lines,
                                "lines from one burst of a sub-swath to the next (default 200)")
                    ->check(cli::whole_number(1, kMaxCount)),
                "C");
  cli::shown_as(app->add_option("--target", targets, "a point target: sub-swath 1 to 5, line, sample, amplitude")
                    ->check(cli::number_list(4, "SWATH,LINE,SAMPLE,AMP"))
                    ->allow_extra_args(false),
                "SWATH,LINE,SAMPLE,AMP");
  cli::shown_as(app->add_option("--seed", c.seed, "random seed (default 7)")->check(cli::whole_number(0, 4294967295LL)),
                "S");
  cli::shown_as(app->add_option("--fault", fault,
                                "the last MDS cut short, or sub-swath D (1 to 5) left out"),
                "truncated|drop-swath=D");

  const cli::Parsed parsed = cli::parse(*app, argc, argv);
  std::string error = parsed.error;
  if (parsed.help) {
    std::fputs(app->help().c_str(), stdout);
    return 0;
  }
  for (const auto& t : targets) {
    if (!error.empty()) break;
    const std::vector<double> v = cli::numbers_of(t);
    if (!(v[0] >= 1.0 && v[0] <= 5.0 && v[0] == std::floor(v[0]))) {
      error = "--target takes SWATH,LINE,SAMPLE,AMP with SWATH from 1 to 5, not '" + t + "'";
      break;
    }
    sar::simulator::WssTarget target;
    target.swath = static_cast<int>(v[0]);
    target.line = v[1];
    target.sample = v[2];
    target.amplitude = v[3];
    c.targets.push_back(target);
  }
  if (error.empty() && !fault.empty()) {
    std::string swath = fault.rfind("drop-swath=", 0) == 0 ? fault.substr(11) : "";
    if (fault == "truncated") c.truncate_mds = true;
    else if (!swath.empty() && cli::whole_number(1, 5)(swath).empty()) c.drop_swath = std::stoi(swath);
    else error = "--fault takes truncated or drop-swath=D with D from 1 to 5, not '" + fault + "'";
  }
  if (!error.empty()) {
    std::fprintf(stderr, "sarsim wss: %s; see sarsim wss --help\n", error.c_str());
    return 2;
  }
  try {
    const auto product = sar::simulator::write_wss_product(c);
    std::printf("%s\n%s\n", product.path.c_str(), c.orbit_path.c_str());
    return 0;
  } catch (const std::exception& e) {
    std::fprintf(stderr, "sarsim wss: %s\n", e.what());
    return 1;
  }
}

// sarsim-rs: writes a simulated RADARSAT-1 CEOS raw product of point targets: the leader
// lea_01.001 (with the platform position record's inertial state vectors), the data file
// dat_01.001 and truth.txt.
//
//   sarsim-rs --out DIR [--beam F1|S3] [--lines N] [--samples M] [--target LAT,LON,H,AMP]...
//             [--noise DB] [--time "dd-MMM-yyyy hh:mm:ss.uuuuuu"] [--ascending] [--seed S]
//             [--replica-every K] [--gap LINE,COUNT] [--swst-change LINE,COUNTS]
//             [--attenuation-step LINE,DB] [--repeated-index LINE]
//             [--clutter-db DB] [--clutter-contrast low|high]
//
// The lines are centred on the first target's beam-centre crossing; with the unsteered beam
// of RADARSAT-1 its zero-Doppler time lies seconds away, outside the raw lines. --samples is a
// multiple of 8.
#include <cmath>
#include <cstdio>
#include <exception>
#include <string>
#include <vector>

#include "base/command_line.hpp"
#include "simulator/rsat_product.hpp"

namespace {

namespace cli = sar::base::cli;

constexpr long long kMaxCount = 100000000;

// Two whole numbers separated by a comma, as "LINE,COUNT".
CLI::Validator whole_pair(const std::string& form) {
  return CLI::Validator(
      [form](std::string& text) -> std::string {
        const std::vector<double> v = cli::numbers_of(text);
        const auto whole = [](double x) { return std::fabs(x) <= kMaxCount && x == std::floor(x); };
        return v.size() == 2 && whole(v[0]) && whole(v[1]) ? std::string()
                                                           : "takes " + form + ", two whole numbers, not '" + text + "'";
      },
      form);
}

// Sets `first` and `second` from a text `whole_pair` accepted.
auto pair_into(int& first, int& second) {
  return [&first, &second](const std::string& text) {
    const std::vector<double> v = cli::numbers_of(text);
    first = static_cast<int>(v[0]);
    second = static_cast<int>(v[1]);
  };
}

}  // namespace

int main(int argc, char** argv) {
  sar::simulator::rsat::RsatConfig c;
  c.targets.clear();
  std::vector<std::string> targets;
  std::string contrast = "low";

  const auto app = cli::make_app(
      "sarsim-rs", "sarsim-rs --out DIR [options]",
      "A simulated RADARSAT-1 CEOS raw product of point targets: the leader lea_01.001, the data file\n"
      "dat_01.001 and truth.txt, whose paths are printed, one a line. The lines are centred on the\n"
      "first target's beam-centre crossing.");
  cli::shown_as(app->add_option("--out", c.out_dir, "output folder (required)")->required(), "DIR");
  cli::shown_as(app->add_option("--beam", c.beam, "beam (default F1)")->check(cli::one_of({"F1", "S3"})), "F1|S3");
  cli::shown_as(app->add_option("--lines", c.lines, "raw lines (default 2048)")->check(cli::whole_number(1, kMaxCount)),
                "N");
  cli::shown_as(app->add_option("--samples", c.samples, "samples of a line, a multiple of 8 (default 1024)")
                    ->check(cli::whole_number(8, kMaxCount)),
                "M");
  cli::shown_as(app->add_option("--target", targets,
                                "a point target, degrees, metres and amplitude (default one at\n"
                                "45,10,0,4)")
                    ->check(cli::number_list(4, "LAT,LON,H,AMP"))
                    ->allow_extra_args(false),
                "LAT,LON,H,AMP");
  cli::shown_as(app->add_option("--noise", c.noise_db,
                                "power of a complex sample before quantisation, dB re 1 (default 3)")
                    ->check(cli::real_number()),
                "DB");
  cli::shown_as(app->add_option("--time", c.scene_time,
                                "beam-centre crossing of the first target (default\n"
                                "10-OCT-2001 14:30:00.000000)"),
                "\"dd-MMM-yyyy hh:mm:ss.uuuuuu\"");
  app->add_flag("--ascending", c.ascending, "an ascending pass (default descending)");
  cli::shown_as(app->add_option("--seed", c.seed, "random seed (default 7)")->check(cli::whole_number(0, kMaxCount)),
                "S");
  cli::shown_as(app->add_option("--replica-every", c.replica_every, "a replica on every K-th line (default 64)")
                    ->check(cli::whole_number(1, kMaxCount)),
                "K");
  cli::shown_as(app->add_option_function<std::string>("--gap", pair_into(c.gap_line, c.gap_length),
                                                      "the records of COUNT lines from LINE missing")
                    ->check(whole_pair("LINE,COUNT")),
                "LINE,COUNT");
  cli::shown_as(app->add_option_function<std::string>("--swst-change",
                                                      pair_into(c.swst_change_line, c.swst_change_counts),
                                                      "the sampling window start grows by COUNTS from LINE")
                    ->check(whole_pair("LINE,COUNTS")),
                "LINE,COUNTS");
  cli::shown_as(app->add_option_function<std::string>("--attenuation-step",
                                                      pair_into(c.attenuation_step_line, c.attenuation_step_db),
                                                      "the receiver attenuation grows by DB from LINE")
                    ->check(whole_pair("LINE,DB")),
                "LINE,DB");
  cli::shown_as(app->add_option("--repeated-index", c.repeated_index_line,
                                "this line's record carries the index of the one before")
                    ->check(cli::whole_number(0, kMaxCount)),
                "LINE");
  cli::shown_as(app->add_option("--clutter-db", c.clutter.power_db, "distributed clutter of this mean power, dB")
                    ->check(cli::real_number()),
                "DB");
  cli::shown_as(app->add_option("--clutter-contrast", contrast,
                                "a homogeneous scene (low, the default) or one of texture, bright\n"
                                "points and a land/water edge (high)")
                    ->check(cli::one_of({"low", "high"})),
                "low|high");

  if (const auto status = cli::parse_main(*app, argc, argv, "sarsim-rs")) return *status;
  try {
    for (const auto& t : targets) {
      const std::vector<double> v = cli::numbers_of(t);
      c.targets.push_back({{v[0], v[1], v[2]}, v[3]});
    }
    if (c.targets.empty()) c.targets.push_back({{45.0, 10.0, 0.0}, 4.0});
    c.clutter.contrast = sar::simulator::clutter_contrast_from_name(contrast);
    (void)sar::simulator::rsat::beam_setup(c.beam);
    const auto truth = sar::simulator::rsat::simulate_rsat(c);
    std::printf("%s\n%s\n%s\n", truth.leader_path.c_str(), truth.data_path.c_str(), truth.truth_path.c_str());
  } catch (const std::exception& e) {
    std::fprintf(stderr, "sarsim-rs: %s\n", e.what());
    return 1;
  }
  return 0;
}

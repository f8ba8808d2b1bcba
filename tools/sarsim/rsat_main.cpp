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
#include <cstdio>
#include <cstdlib>
#include <exception>
#include <stdexcept>
#include <string>
#include <vector>

#include "simulator/rsat_product.hpp"

namespace {

void usage() {
  std::fputs(
      "usage: sarsim-rs --out DIR [--beam F1|S3] [--lines N] [--samples M] [--target LAT,LON,H,AMP]...\n"
      "                 [--noise DB] [--time \"dd-MMM-yyyy hh:mm:ss.uuuuuu\"] [--ascending] [--seed S]\n"
      "                 [--replica-every K] [--gap LINE,COUNT] [--swst-change LINE,COUNTS]\n"
      "                 [--attenuation-step LINE,DB] [--repeated-index LINE]\n"
      "                 [--clutter-db DB] [--clutter-contrast low|high]\n",
      stderr);
}

std::vector<double> numbers(const std::string& text, std::size_t count, const char* what) {
  std::vector<double> out;
  std::size_t start = 0;
  while (true) {
    const std::size_t comma = text.find(',', start);
    const std::string part = text.substr(start, comma - start);
    char* end = nullptr;
    const double v = std::strtod(part.c_str(), &end);
    if (part.empty() || *end != '\0') throw std::invalid_argument(std::string("bad ") + what + ": " + text);
    out.push_back(v);
    if (comma == std::string::npos) break;
    start = comma + 1;
  }
  if (out.size() != count) throw std::invalid_argument(std::string("bad ") + what + ": " + text);
  return out;
}

}  // namespace

int main(int argc, char** argv) {
  sar::simulator::rsat::RsatConfig c;
  c.targets.clear();
  bool haveOut = false;
  try {
    for (int i = 1; i < argc; ++i) {
      const std::string arg = argv[i];
      auto value = [&]() -> std::string {
        if (i + 1 >= argc) throw std::invalid_argument("missing value after " + arg);
        return argv[++i];
      };
      auto integer = [&](const char* what) { return static_cast<int>(numbers(value(), 1, what)[0]); };
      if (arg == "--out") {
        c.out_dir = value();
        haveOut = true;
      } else if (arg == "--beam") {
        c.beam = value();
      } else if (arg == "--lines") {
        c.lines = integer("line count");
      } else if (arg == "--samples") {
        c.samples = integer("sample count");
      } else if (arg == "--target") {
        const auto v = numbers(value(), 4, "target (LAT,LON,H,AMP)");
        c.targets.push_back({{v[0], v[1], v[2]}, v[3]});
      } else if (arg == "--noise") {
        c.noise_db = numbers(value(), 1, "noise")[0];
      } else if (arg == "--time") {
        c.scene_time = value();
      } else if (arg == "--ascending") {
        c.ascending = true;
      } else if (arg == "--seed") {
        c.seed = static_cast<uint64_t>(integer("seed"));
      } else if (arg == "--replica-every") {
        c.replica_every = integer("replica spacing");
      } else if (arg == "--gap") {
        const auto v = numbers(value(), 2, "gap (LINE,COUNT)");
        c.gap_line = static_cast<int>(v[0]);
        c.gap_length = static_cast<int>(v[1]);
      } else if (arg == "--swst-change") {
        const auto v = numbers(value(), 2, "SWST change (LINE,COUNTS)");
        c.swst_change_line = static_cast<int>(v[0]);
        c.swst_change_counts = static_cast<int>(v[1]);
      } else if (arg == "--attenuation-step") {
        const auto v = numbers(value(), 2, "attenuation step (LINE,DB)");
        c.attenuation_step_line = static_cast<int>(v[0]);
        c.attenuation_step_db = static_cast<int>(v[1]);
      } else if (arg == "--clutter-db") {
        c.clutter.power_db = numbers(value(), 1, "clutter power")[0];
      } else if (arg == "--clutter-contrast") {
        c.clutter.contrast = sar::simulator::clutter_contrast_from_name(value());
      } else if (arg == "--repeated-index") {
        c.repeated_index_line = integer("line");
      } else if (arg == "--help" || arg == "-h") {
        usage();
        return 0;
      } else {
        throw std::invalid_argument("unknown option " + arg);
      }
    }
    if (!haveOut) throw std::invalid_argument("--out is required");
    if (c.targets.empty()) c.targets.push_back({{45.0, 10.0, 0.0}, 4.0});
    (void)sar::simulator::rsat::beam_setup(c.beam);
  } catch (const std::invalid_argument& e) {
    std::fprintf(stderr, "sarsim-rs: %s\n", e.what());
    usage();
    return 2;
  }
  try {
    const auto truth = sar::simulator::rsat::simulate_rsat(c);
    std::printf("%s\n%s\n%s\n", truth.leader_path.c_str(), truth.data_path.c_str(), truth.truth_path.c_str());
  } catch (const std::exception& e) {
    std::fprintf(stderr, "sarsim-rs: %s\n", e.what());
    return 1;
  }
  return 0;
}

// sarsim: writes a simulated ENVISAT ASAR level 0 product of point targets (image mode,
// alternating polarisation or wide swath), its DOR_VOR orbit file, the matching ASA_INS and
// ASA_XCA products and a truth file.
//
//   sarsim --out DIR [--mode im|apc|aph|apv|ws] [--block-echoes L]
//          [--lines N] [--samples M] [--target LAT,LON,H,AMP]... [--noise DB]
//          [--fault NAME]... [--time "dd-MMM-yyyy hh:mm:ss.uuuuuu"] [--ascending] [--seed S]
//          [--first-counter C] [--ins-template FILE] [--xca-template FILE] [--no-aux]
//          [--yaw-steering on|off] [--squint-hz F] [--yaw-bias-deg D]
//          [--clutter-db DB] [--clutter-contrast low|high]
//
// The beam is steered to zero Doppler unless --yaw-steering on (ENVISAT's yaw steering law)
// or --squint-hz F (the squint that puts the Doppler centroid at F Hz at the scene centre).
//
// --clutter-db DB adds distributed clutter of mean power DB (dB re 1 count^2 per raw sample,
// before the receive gain) with the beam's centroid; --clutter-contrast chooses a homogeneous
// scene (low, the default) or one of texture, bright points and a land/water edge (high).
//
// The ASA_INS and ASA_XCA are patched copies of real products (by default those of the sample
// archive the build was configured with); --no-aux writes neither.
//
// --mode chooses the acquisition (image mode by default); --lines counts the packets of the
// stream. AP and WS products start with the acquisition, so their initial noise and calibration
// packets (210 in AP, 525 in WS) come first; a WS cycle is about 360 packets. --block-echoes sets
// the AP block length L (default: the ASA_INS template's value for the beam).
//
// Faults: lost, corrupt-header, mode-id, seq-wrap, swst-change, truncated.
#include <cstdio>
#include <cstdlib>
#include <exception>
#include <stdexcept>
#include <string>
#include <vector>

#include "simulator/simulator.hpp"

namespace {

void usage() {
  std::fputs(
      "usage: sarsim --out DIR [--mode im|apc|aph|apv|ws] [--block-echoes L]\n"
      "              [--lines N] [--samples M] [--target LAT,LON,H,AMP]... [--noise DB]\n"
      "              [--fault lost|corrupt-header|mode-id|seq-wrap|swst-change|truncated]...\n"
      "              [--time \"dd-MMM-yyyy hh:mm:ss.uuuuuu\"] [--ascending] [--seed S] [--first-counter C]\n"
      "              [--ins-template FILE] [--xca-template FILE] [--no-aux]\n"
      "              [--yaw-steering on|off] [--squint-hz F] [--yaw-bias-deg D]\n"
      "              [--clutter-db DB] [--clutter-contrast low|high]\n"
      "       sarsim wss --out DIR [--orbit FILE] [--time T] [--samples N] [--bursts K] [--burst-lines L]\n"
      "              [--cycle-lines C] [--target SWATH,LINE,SAMPLE,AMP]... [--seed S]\n"
      "              [--fault truncated|drop-swath=D]   (an ASA_WSS_1P level 1 product)\n",
      stderr);
}

// Real products the auxiliary files are copied from, unless the command line names others.
const char* const kInsTemplate =
    SARSIM_REAL_DATA_DIR "/ASA_INS_AX/ASA_INS_AXVIEC20101222_143805_20101022_000000_20141231_235959";
const char* const kXcaTemplate =
    SARSIM_REAL_DATA_DIR "/ASA_XCA_AX/ASA_XCA_AXVIEC20101111_113830_20100601_000000_20141231_000000";

double number(const std::string& text, const char* what) {
  char* end = nullptr;
  const double v = std::strtod(text.c_str(), &end);
  if (text.empty() || end == nullptr || *end != '\0') throw std::invalid_argument(std::string("bad ") + what + ": " + text);
  return v;
}

sar::simulator::Target parse_target(const std::string& text) {
  std::vector<std::string> parts;
  std::size_t start = 0;
  while (true) {
    const std::size_t comma = text.find(',', start);
    parts.push_back(text.substr(start, comma - start));
    if (comma == std::string::npos) break;
    start = comma + 1;
  }
  if (parts.size() != 4) throw std::invalid_argument("a target is LAT,LON,H,AMP: " + text);
  sar::simulator::Target t;
  t.position = {number(parts[0], "latitude"), number(parts[1], "longitude"), number(parts[2], "height")};
  t.amplitude = number(parts[3], "amplitude");
  if (t.position.lat_deg < -90.0 || t.position.lat_deg > 90.0) throw std::invalid_argument("latitude out of range");
  return t;
}

}  // namespace

int wss_main(int argc, char** argv, const std::string& defaultOrbit);

int main(int argc, char** argv) {
  if (argc > 1 && std::string(argv[1]) == "wss")
    return wss_main(argc - 1, argv + 1,
                    std::string(SARSIM_REAL_DATA_DIR) +
                        "/DOR_VOR_AX/DOR_VOR_AXVF-P20080331_075200_20080301_215527_20080303_002327");
  sar::simulator::SimulationConfig config;
  config.ins_template = kInsTemplate;
  config.xca_template = kXcaTemplate;
  bool have_out = false;
  try {
    for (int i = 1; i < argc; ++i) {
      const std::string arg = argv[i];
      auto value = [&]() -> std::string {
        if (i + 1 >= argc) throw std::invalid_argument("missing value after " + arg);
        return argv[++i];
      };
      if (arg == "--out") {
        config.out_dir = value();
        have_out = true;
      } else if (arg == "--mode") {
        config.mode = sar::simulator::mode_from_name(value());
      } else if (arg == "--block-echoes") {
        config.ap.block_echoes = static_cast<int>(number(value(), "block echoes"));
      } else if (arg == "--lines") {
        config.lines = static_cast<int>(number(value(), "line count"));
      } else if (arg == "--samples") {
        config.samples = static_cast<int>(number(value(), "sample count"));
      } else if (arg == "--target") {
        config.targets.push_back(parse_target(value()));
      } else if (arg == "--noise") {
        config.noise_db = number(value(), "noise level");
      } else if (arg == "--fault") {
        config.faults.push_back(sar::simulator::fault_from_name(value()));
      } else if (arg == "--time") {
        config.scene_time = value();
      } else if (arg == "--ascending") {
        config.ascending = true;
      } else if (arg == "--seed") {
        config.seed = static_cast<uint64_t>(number(value(), "seed"));
      } else if (arg == "--first-counter") {
        config.first_counter = static_cast<int>(number(value(), "counter"));
      } else if (arg == "--ins-template") {
        config.ins_template = value();
      } else if (arg == "--xca-template") {
        config.xca_template = value();
      } else if (arg == "--no-aux") {
        config.ins_template.clear();
        config.xca_template.clear();
      } else if (arg == "--yaw-steering") {
        const std::string v = value();
        if (v != "on" && v != "off") throw std::invalid_argument("--yaw-steering is on or off: " + v);
        config.attitude.yaw_steering = v == "on";
      } else if (arg == "--squint-hz") {
        config.centroid_hz = number(value(), "Doppler centroid");
      } else if (arg == "--yaw-bias-deg") {
        config.attitude.yaw_bias_rad = number(value(), "yaw bias") * 3.14159265358979323846 / 180.0;
      } else if (arg == "--clutter-db") {
        config.clutter.power_db = number(value(), "clutter power");
      } else if (arg == "--clutter-contrast") {
        config.clutter.contrast = sar::simulator::clutter_contrast_from_name(value());
      } else if (arg == "--help" || arg == "-h") {
        usage();
        return 0;
      } else {
        throw std::invalid_argument("unknown option " + arg);
      }
    }
    if (!have_out) throw std::invalid_argument("--out is required");
    if (config.targets.empty()) config.targets.push_back({{45.0, 10.0, 0.0}, 30.0});
    const sar::simulator::SimulationTruth truth = sar::simulator::run_simulation(config);
    std::printf("%s\n%s\n", truth.level0_path.c_str(), truth.orbit_path.c_str());
    if (!truth.ins_path.empty()) std::printf("%s\n", truth.ins_path.c_str());
    if (!truth.xca_path.empty()) std::printf("%s\n", truth.xca_path.c_str());
    std::printf("%s\n", truth.truth_path.c_str());
    return 0;
  } catch (const std::invalid_argument& e) {
    std::fprintf(stderr, "sarsim: %s\n", e.what());
    usage();
    return 2;
  } catch (const std::exception& e) {
    std::fprintf(stderr, "sarsim: %s\n", e.what());
    return 1;
  }
}

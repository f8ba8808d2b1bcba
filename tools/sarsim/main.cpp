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
#include <exception>
#include <string>
#include <vector>

#include "base/command_line.hpp"
#include "simulator/simulator.hpp"
#include "base/constants.hpp"

namespace {

// Real products the auxiliary files are copied from, unless the command line names others.
const char* const kInsTemplate =
    SARSIM_REAL_DATA_DIR "/ASA_INS_AX/ASA_INS_AXVIEC20101222_143805_20101022_000000_20141231_235959";
const char* const kXcaTemplate =
    SARSIM_REAL_DATA_DIR "/ASA_XCA_AX/ASA_XCA_AXVIEC20101111_113830_20100601_000000_20141231_000000";

using sar::base::kPi;
constexpr long long kMaxCount = 100000000;

}  // namespace

int wss_main(int argc, char** argv, const std::string& defaultOrbit);

int main(int argc, char** argv) {
  if (argc > 1 && std::string(argv[1]) == "wss")
    return wss_main(argc - 1, argv + 1,
                    std::string(SARSIM_REAL_DATA_DIR) +
                        "/DOR_VOR_AX/DOR_VOR_AXVF-P20080331_075200_20080301_215527_20080303_002327");
  namespace cli = sar::base::cli;
  sar::simulator::SimulationConfig config;
  config.ins_template = kInsTemplate;
  config.xca_template = kXcaTemplate;
  std::string mode = "im", yawSteering, contrast = "low";
  std::vector<std::string> targets, faults;
  double squintHz = 0.0, yawBiasDeg = 0.0;
  bool noAux = false;

  const auto app = cli::make_app(
      "sarsim",
      "sarsim --out DIR [--mode im|apc|aph|apv|ws] [options]\n"
      "       sarsim wss --out DIR [options]   (an ASA_WSS_1P level 1 product; sarsim wss --help)",
      "A simulated ENVISAT ASAR level 0 product of point targets, its DOR_VOR orbit file, the matching\n"
      "ASA_INS and ASA_XCA products and a truth file; their paths are printed, one a line.");
  cli::shown_as(app->add_option("--out", config.out_dir, "output folder (required)")->required(), "DIR");
  cli::shown_as(app->add_option("--mode", mode,
                                "acquisition: image mode (default), alternating polarisation (apc, aph,\n"
                                "apv) or wide swath; AP and WS products start with their noise and\n"
                                "calibration packets (210 in AP, 525 in WS), a WS cycle is about 360")
                    ->check(cli::one_of({"im", "apc", "aph", "apv", "ws"})),
                "MODE");
  app->add_flag("--ap-archive-name", config.ap.generic_name,
                "AP: name the product ASA_AP__0P with SPH mode letters AP_, as the archive does, so that only the "
                "packets tell the sub-mode");
  cli::shown_as(app->add_option("--block-echoes", config.ap.block_echoes,
                                "AP block length (default: the ASA_INS template's value for the beam)")
                    ->check(cli::whole_number(1, kMaxCount)),
                "L");
  cli::shown_as(app->add_option("--lines", config.lines, "packets of the stream (default 512)")
                    ->check(cli::whole_number(1, kMaxCount)),
                "N");
  cli::shown_as(app->add_option("--samples", config.samples, "complex samples of an echo line (default 1024)")
                    ->check(cli::whole_number(1, kMaxCount)),
                "M");
  cli::shown_as(app->add_option("--target", targets,
                                "a point target, degrees, metres and amplitude (default one at\n"
                                "45,10,0,30)")
                    ->check(cli::number_list(4, "LAT,LON,H,AMP"))
                    ->allow_extra_args(false),
                "LAT,LON,H,AMP");
  cli::shown_as(app->add_option("--noise", config.noise_db,
                                "noise power of a complex sample, dB re 1 count^2 (default 20;\n"
                                "below -100: none)")
                    ->check(cli::real_number()),
                "DB");
  cli::shown_as(app->add_option("--fault", faults, "a fault of the stream, repeatable")
                    ->check(cli::one_of({"lost", "corrupt-header", "mode-id", "seq-wrap", "swst-change", "truncated",
                                         "swapped-polarisation"}))
                    ->allow_extra_args(false),
                "lost|corrupt-header|mode-id|seq-wrap|swst-change|truncated|swapped-polarisation");
  cli::shown_as(app->add_option("--time", config.scene_time,
                                "zero-Doppler time of the first target (default 02-MAR-2008 10:00:00.000000)"),
                "\"dd-MMM-yyyy hh:mm:ss.uuuuuu\"");
  app->add_flag("--ascending", config.ascending, "an ascending pass (default descending)");
  cli::shown_as(app->add_option("--seed", config.seed, "random seed (default 1)")->check(cli::whole_number(0, kMaxCount)),
                "S");
  cli::shown_as(app->add_option("--first-counter", config.first_counter, "the first packet's sequence counter")
                    ->check(cli::whole_number(-1, kMaxCount)),
                "C");
  cli::shown_as(app->add_option("--ins-template", config.ins_template,
                                "ASA_INS product to patch (default: the sample archive's)"),
                "FILE");
  cli::shown_as(app->add_option("--xca-template", config.xca_template,
                                "ASA_XCA product to patch (default: the sample archive's)"),
                "FILE");
  app->add_flag("--no-aux", noAux, "write neither ASA_INS nor ASA_XCA");
  cli::shown_as(app->add_option("--yaw-steering", yawSteering,
                                "ENVISAT's yaw steering law (default off: the beam is steered to\n"
                                "zero Doppler)")
                    ->check(cli::one_of({"on", "off"})),
                "on|off");
  auto* squint = app->add_option("--squint-hz", squintHz,
                                 "the squint that puts the Doppler centroid at F Hz at the scene centre")
                     ->check(cli::real_number());
  cli::shown_as(squint, "F");
  cli::shown_as(app->add_option("--yaw-bias-deg", yawBiasDeg, "a yaw bias, degrees")->check(cli::real_number()), "D");
  cli::shown_as(app->add_option("--clutter-db", config.clutter.power_db,
                                "distributed clutter of this mean power (dB re 1 count^2 a raw\n"
                                "sample, before the receive gain) with the beam's centroid")
                    ->check(cli::real_number()),
                "DB");
  cli::shown_as(app->add_option("--clutter-contrast", contrast,
                                "a homogeneous scene (low, the default) or one of texture, bright\n"
                                "points and a land/water edge (high)")
                    ->check(cli::one_of({"low", "high"})),
                "low|high");

  if (const auto status = cli::parse_main(*app, argc, argv, "sarsim")) return *status;
  try {
    config.mode = sar::simulator::mode_from_name(mode);
    for (const auto& f : faults) config.faults.push_back(sar::simulator::fault_from_name(f));
    for (const auto& t : targets) {
      const std::vector<double> v = cli::numbers_of(t);
      if (v[0] < -90.0 || v[0] > 90.0) {
        std::fprintf(stderr, "sarsim: --target latitude out of range: %s; see sarsim --help\n", t.c_str());
        return 2;
      }
      config.targets.push_back({{v[0], v[1], v[2]}, v[3]});
    }
    if (config.targets.empty()) config.targets.push_back({{45.0, 10.0, 0.0}, 30.0});
    if (noAux) {
      config.ins_template.clear();
      config.xca_template.clear();
    }
    if (!yawSteering.empty()) config.attitude.yaw_steering = yawSteering == "on";
    if (squint->count() > 0) config.centroid_hz = squintHz;
    config.attitude.yaw_bias_rad = yawBiasDeg * kPi / 180.0;
    config.clutter.contrast = sar::simulator::clutter_contrast_from_name(contrast);
    const sar::simulator::SimulationTruth truth = sar::simulator::run_simulation(config);
    std::printf("%s\n%s\n", truth.level0_path.c_str(), truth.orbit_path.c_str());
    if (!truth.ins_path.empty()) std::printf("%s\n", truth.ins_path.c_str());
    if (!truth.xca_path.empty()) std::printf("%s\n", truth.xca_path.c_str());
    std::printf("%s\n", truth.truth_path.c_str());
    return 0;
  } catch (const std::exception& e) {
    std::fprintf(stderr, "sarsim: %s\n", e.what());
    return 1;
  }
}

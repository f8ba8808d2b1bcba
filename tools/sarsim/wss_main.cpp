// sarsim wss: a simulated ASA_WSS_1P product (see simulator/wss_product.hpp).
//
//   sarsim wss --out DIR [--orbit FILE] [--time "dd-MMM-yyyy hh:mm:ss.uuuuuu"] [--samples N]
//              [--bursts K] [--burst-lines L] [--cycle-lines C] [--target SWATH,LINE,SAMPLE,AMP]...
//              [--seed S] [--fault truncated|drop-swath=D]
//
// The orbit defaults to the real DOR_VOR of the sample archive, which covers 01-MAR-2008 21:55
// to 03-MAR-2008 00:23; the default start time lies inside it.
#include <cstdio>
#include <cstdlib>
#include <stdexcept>
#include <string>

#include "simulator/wss_product.hpp"

int wss_main(int argc, char** argv, const std::string& defaultOrbit) {
  sar::simulator::WssConfig c;
  c.orbit_path = defaultOrbit;
  bool haveOut = false;
  try {
    for (int i = 1; i < argc; ++i) {
      const std::string arg = argv[i];
      auto value = [&]() -> std::string {
        if (i + 1 >= argc) throw std::invalid_argument("missing value after " + arg);
        return argv[++i];
      };
      if (arg == "--out") {
        c.out_dir = value();
        haveOut = true;
      } else if (arg == "--orbit") c.orbit_path = value();
      else if (arg == "--time") c.start_time = value();
      else if (arg == "--samples") c.samples = std::stoi(value());
      else if (arg == "--bursts") c.bursts = std::stoi(value());
      else if (arg == "--burst-lines") c.burst_lines = std::stoi(value());
      else if (arg == "--cycle-lines") c.cycle_lines = std::stoi(value());
      else if (arg == "--seed") c.seed = static_cast<unsigned>(std::stoul(value()));
      else if (arg == "--target") {
        sar::simulator::WssTarget t;
        const std::string v = value();
        if (std::sscanf(v.c_str(), "%d,%lf,%lf,%lf", &t.swath, &t.line, &t.sample, &t.amplitude) != 4 || t.swath < 1 ||
            t.swath > 5)
          throw std::invalid_argument("--target takes SWATH,LINE,SAMPLE,AMP: " + v);
        c.targets.push_back(t);
      } else if (arg == "--fault") {
        const std::string v = value();
        if (v == "truncated") c.truncate_mds = true;
        else if (v.rfind("drop-swath=", 0) == 0) c.drop_swath = std::stoi(v.substr(11));
        else throw std::invalid_argument("unknown fault " + v);
      } else {
        throw std::invalid_argument("unknown option " + arg);
      }
    }
    if (!haveOut) throw std::invalid_argument("--out is required");
    const auto product = sar::simulator::write_wss_product(c);
    std::printf("%s\n%s\n", product.path.c_str(), c.orbit_path.c_str());
    return 0;
  } catch (const std::invalid_argument& e) {
    std::fprintf(stderr, "sarsim wss: %s\n", e.what());
    return 2;
  } catch (const std::exception& e) {
    std::fprintf(stderr, "sarsim wss: %s\n", e.what());
    return 1;
  }
}

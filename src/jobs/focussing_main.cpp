// focussing: the host's entry. One command string (further arguments are joined to it with a
// blank), one job, the outcome in the working directory's files and the exit status.
#include <csignal>
#include <cstdio>
#include <cstring>
#include <string>

#include "base/run_services.hpp"
#include "jobs/entry.hpp"
#include "jobs/setup.hpp"

int main(int argc, char** argv) {
  if (argc < 2) {
    std::fprintf(stderr,
                 "usage: focussing \"main_focussing_asar_IM#/path/job.txt\"\n"
                 "       focussing --setup DIR [--mode IM|AP|WS|RS|WSS] [--aux DIR]... [--arg N=VALUE]...\n"
                 "       focussing --aux-index DESDIR AUXDIR...\n"
                 "Modes: main_focussing_asar_IM#, main_focussing_asar_AP#, main_focussing_asar_WS#,\n"
                 "       main_focussing_asar_RS#, main_multilook_WSS#\n");
    return 2;
  }
  if (std::strcmp(argv[1], "--setup") == 0) return sar::jobs::setup_main(argc - 2, argv + 2);
  if (std::strcmp(argv[1], "--aux-index") == 0) return sar::jobs::aux_index_main(argc - 2, argv + 2);
  if (std::strcmp(argv[1], "--version") == 0) {
    std::printf("%s\n", "focussing (VanterraFocRadarsatASARPalsar ENVI 3.0.000.003)");
    return 0;
  }
  // A file size limit must show up as a failed write that the job reports, not as a signal that
  // ends the process before it can say why.
  std::signal(SIGXFSZ, SIG_IGN);
  // A host or a batch that stops the job with SIGTERM gets an error record saying so.
  sar::base::install_stop_handlers();
  std::string command = argv[1];
  for (int i = 2; i < argc; ++i) {
    command += ' ';
    command += argv[i];
  }
  return sar::jobs::focussing_entry(std::move(command));
}

#pragma once
// Lay out a working directory for one job, so that a job can be run by hand without a host:
// the configuration file, a description directory with the shipped parameter files and
// catalogues, the working file, and a job list to fill in.
#include <string>
#include <vector>

namespace sar::jobs {

struct SetupRequest {
  std::string dir;            // working directory to create
  std::string mode = "IM";    // IM, AP, WS, RS or WSS
  std::string dataDir;        // shipped data folder; empty: the build's own
  std::vector<std::string> arguments;  // job arguments; missing ones are "NotOK" or defaults
  bool tracing = false;
  std::vector<std::string> auxDirs;  // archives of ASA_INS/ASA_XCA/ASA_XCH to index
};

/// Create the layout; returns the job list path. Existing parameter files are kept.
std::string setup_working_dir(const SetupRequest& request);

/// The command string that runs the job of a laid-out directory.
std::string command_for(const std::string& mode, const std::string& listPath);

/// `focussing --setup DIR [--mode M] [--data DIR] [--trace] [--arg N=VALUE ...]`
int setup_main(int argc, char** argv);

/// `focussing --aux-index DESDIR AUXDIR...`: index an auxiliary archive for DESDIR.
int aux_index_main(int argc, char** argv);

/// The shipped data folder of this build (parameter files, catalogues, templates).
std::string default_data_dir();

}  // namespace sar::jobs

#pragma once
// Standalone use of the engine: one product in, the host protocol laid out privately, the
// focussing executable run, its progress shown and its outcome summed up in one line.
#include <cstdio>
#include <string>
#include <vector>

namespace sar::jobs {

struct StandaloneRequest {
  std::string mode = "im";  // im, ap, ws, rs, wss
  std::string product;
  std::string orbit;        // orbit file, or a folder of orbit files to choose from
  std::string auxDir;       // folder of ASA_INS / ASA_XCA / ASA_XCH products (empty: shipped index)
  std::string outDir = ".";
  int quickLookWidth = 1024;
  int quickLookHeight = 1024;
  int threads = 0;          // 0: the machine's default
  std::vector<std::string> params;  // "Key=VALUE" or "Section.Key=VALUE"
  std::string paramsFile;   // profile file of sections and keys that override the defaults
  bool tracing = false;
};

struct StandaloneOutcome {
  int status = 0;                     // exit status for the shell
  std::string summary;                // the one-line summary
  std::vector<std::string> products;  // files written
  std::string workDir;
};

/// Run one product. `progress` receives the progress display (a bar on a terminal, plain lines
/// otherwise); null for none.
StandaloneOutcome run_standalone(const StandaloneRequest& request, const std::string& focussingExe,
                                 std::FILE* progress);

/// Apply "Key=VALUE" / "Section.Key=VALUE" overrides to a parameter file; a key that the file
/// does not hold is an error (returned as a message, empty on success).
std::string apply_parameter_overrides(const std::string& parameterFile, const std::vector<std::string>& overrides);

/// `sarfocus MODE PRODUCT [options]`
int sarfocus_main(int argc, char** argv);

}  // namespace sar::jobs

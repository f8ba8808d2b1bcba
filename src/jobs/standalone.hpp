#pragma once
// Standalone use of the engine: one product in, the host protocol laid out privately, the
// focussing executable run, its progress shown and its outcome summed up in one line.
//
// Layout of an output folder OUT: the products OUT/<stem>_slc, <stem>_slc_hdr, ... (<stem> is
// the product's file name without its extension) and one working directory a product,
// OUT/.sarfocus/<stem>/, which holds the host's files (configuration, job list, log, error
// record), the job's work files and, after a successful run, the completion marker. The job
// writes its products into the working directory; they are moved into OUT only when the job
// has succeeded, so OUT never holds a half-written product.
#include <cstdio>
#include <string>
#include <string_view>
#include <vector>

namespace CLI {
class App;
}

namespace sar::jobs {

struct StandaloneRequest {
  std::string mode = "im";  // im, ap, ws, rs, wss
  std::string product;
  std::string orbit;        // orbit file, or a folder of orbit files to choose from
  std::string auxDir;       // folder of ASA_INS / ASA_XCA / ASA_XCH products (empty: shipped index)
  std::string outDir = ".";
  bool quickLook = true;
  int quickLookWidth = 1024;
  int quickLookHeight = 1024;
  int threads = 0;          // 0: the machine's default
  std::vector<std::string> params;  // "Key=VALUE" or "Section.Key=VALUE"
  std::string paramsFile;   // profile file of sections and keys that override the defaults
  bool tracing = false;
  bool skipComplete = false;  // leave a product alone whose outputs are complete
  std::string multilook;      // "AZxRG" or "auto": a multilooked image of the SLC too (im, ap)
  bool groundRange = false;   // the multilooked image in ground range
  double groundStep = 0.0;    // its ground step, m (0: chosen from the looks)
};

enum class StandaloneResult {
  kDone,         // products written (perhaps with warnings)
  kSkipped,      // the outputs of an earlier run are complete
  kFailed,       // the job ended with an error record
  kNotBuilt,     // the job stopped at a stage this build does not hold
  kBadRequest,   // nothing was run: the request or its inputs are wrong
};

struct StandaloneOutcome {
  int status = 0;                     // exit status for the shell
  StandaloneResult result = StandaloneResult::kDone;
  std::string summary;                // the one-line summary
  std::string error;                  // failures: the error text alone (no prefix, no log path)
  std::vector<std::string> products;  // files in the output folder
  std::string slc;                    // the SLC among them (empty when none)
  std::string workDir;
  double seconds = 0.0;               // wall time of the job
};

/// Exit statuses of sarfocus besides 0 (success) and focussing's own (a failed job).
inline constexpr int kExitBadRequest = 2;
inline constexpr int kExitNotBuilt = 3;

/// Run one product. `progress` receives the progress display (a bar on a terminal, plain lines
/// otherwise); null for none. Safe to call from several threads at once.
StandaloneOutcome run_standalone(const StandaloneRequest& request, const std::string& focussingExe,
                                 std::FILE* progress);

/// Product stem: the file name without its extension; it names the products and the
/// working directory.
std::string product_stem(const std::string& product);

/// Working directory of `product` below the output folder `outDir`.
std::string working_dir_for(const std::string& outDir, const std::string& product);

/// Why new files cannot be put into the output folder `outDir` (or into the nearest folder
/// that exists above it, when it does not exist yet); empty when they can. A folder without any
/// write permission counts as read-only, also for root.
std::string output_dir_problem(const std::string& outDir);

/// Name of the completion marker in a working directory, written last by a successful run.
inline constexpr std::string_view kCompletionMarker = "sarfocus.complete";

/// True when an earlier run of `request` (same mode and product name) succeeded and its
/// outputs are complete: the marker, the SLC and its `_slc_hdr` annotation with the sizes the
/// marker recorded, and the quick-look when the request asks for one.
bool outputs_complete(const StandaloneRequest& request);

/// Apply "Key=VALUE" / "Section.Key=VALUE" overrides to a parameter file; a key that the file
/// does not hold is an error (returned as a message, empty on success).
std::string apply_parameter_overrides(const std::string& parameterFile, const std::vector<std::string>& overrides);

/// The modes sarfocus knows, as the command line spells them.
bool known_mode(std::string_view mode);

/// Parse the options of `sarfocus MODE PRODUCT [options]` from args[first] on into `request`
/// (the product is the first argument that is not an option). Returns an error message, empty
/// on success; `help` is set when --help was given.
std::string parse_standalone_options(const std::vector<std::string>& args, std::size_t first,
                                     StandaloneRequest& request, bool& help);

/// Adds the options of `sarfocus MODE PRODUCT` (all but the product) to a command line that
/// fills `request`: the modes and `sarfocus batch` share them.
void add_standalone_options(CLI::App& app, StandaloneRequest& request);

/// The options that reproduce `request` on a command line (without mode and product).
std::vector<std::string> standalone_options(const StandaloneRequest& request);

/// Help texts: "" for the overview, a mode, or "batch". Empty for an unknown topic.
std::string sarfocus_help(std::string_view topic);

/// Where sarfocus finds its executables.
struct SarfocusTools {
  std::string focussing;  // the engine's host entry
  std::string sarfocus;   // sarfocus itself, named in emitted batch scripts
};

/// `sarfocus ...` with its arguments (without the program name), writing to `out` and `err`.
int sarfocus_run(const std::vector<std::string>& args, const SarfocusTools& tools, std::FILE* out,
                 std::FILE* err);

/// `sarfocus MODE PRODUCT [options]`, `sarfocus batch ...`, `sarfocus --help|--version`.
int sarfocus_main(int argc, char** argv);

}  // namespace sar::jobs

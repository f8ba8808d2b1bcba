#include "jobs/setup.hpp"

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <stdexcept>

#include "base/command_line.hpp"
#include "jobs/aux_lookup.hpp"
#include "jobs/drivers.hpp"

namespace sar::jobs {
namespace fs = std::filesystem;

namespace {

struct ModeInfo {
  const char* mode;
  const char* prefix;
  const char* parameterFile;
};
constexpr ModeInfo kModeInfo[] = {
    {"IM", "main_focussing_asar_IM#", "parameters_IM.hdr"}, {"AP", "main_focussing_asar_AP#", "parameters_AP.hdr"},
    {"WS", "main_focussing_asar_WS#", "parameters_WS.hdr"}, {"RS", "main_focussing_asar_RS#", "parameters_RS.hdr"},
    {"WSS", "main_multilook_WSS#", "parameters_multilook.hdr"}};

const ModeInfo& mode_info(const std::string& mode) {
  for (const auto& m : kModeInfo)
    if (mode == m.mode) return m;
  throw std::invalid_argument("unknown mode '" + mode + "' (IM, AP, WS, RS or WSS)");
}

std::string slash(const fs::path& p) {
  std::string s = p.string();
  if (s.empty() || s.back() != '/') s.push_back('/');
  return s;
}

// Default job arguments: inputs not given, a root name in the working directory, a 1024 x 1024
// quick-look requested at scale 1.
std::vector<std::string> default_arguments(const fs::path& dir) {
  std::vector<std::string> a(kMinJobArguments, std::string(kNotOK));
  a[4] = (dir / "product").string();
  a[5] = "1024";
  a[6] = "1024";
  a[8] = "0";
  a[9] = "0";
  a[12] = "OK";
  a[13] = "1.0";
  return a;
}

}  // namespace

std::string default_data_dir() {
  if (const char* d = std::getenv("SAR_DATA_DIR"); d && *d) return d;
#ifdef SAR_SHIPPED_DATA_DIR
  return SAR_SHIPPED_DATA_DIR;
#else
  return "data";
#endif
}

std::string command_for(const std::string& mode, const std::string& listPath) {
  return std::string(mode_info(mode).prefix) + listPath;
}

std::string setup_working_dir(const SetupRequest& request) {
  const ModeInfo& mode = mode_info(request.mode);
  const fs::path dir = fs::absolute(request.dir);
  const fs::path data = fs::absolute(request.dataDir.empty() ? default_data_dir() : request.dataDir);
  const fs::path des = dir / "des";
  fs::create_directories(des);

  // Parameter files and catalogues are copied, not linked, so that a job's tuning stays with it.
  for (const auto& entry : fs::directory_iterator(data)) {
    const std::string ext = entry.path().extension().string();
    if (entry.is_regular_file() && (ext == ".hdr" || ext == ".des")) {
      const fs::path target = des / entry.path().filename();
      if (!fs::exists(target)) fs::copy_file(entry.path(), target);
    }
  }

  // The auxiliary index names files relative to the description directory, so it is written
  // anew for this one: from the archives asked for, else from the shipped index.
  write_aux_index(request.auxDirs.empty() ? read_aux_index(slash(data)) : scan_aux_products(request.auxDirs),
                  slash(des));

  {
    std::ofstream ini(dir / "Vanterra_configuration.ini", std::ios::trunc);
    const std::string d = slash(dir);
    ini << d << "keys/\n"                    // key files
        << d << "mandatory/\n"               // mandatory files
        << d << "\n"                         // working directory
        << d << "\n"                         // program directory
        << d << "maps/\n"                    // map projections
        << slash(des) << "\n"                // description directory
        << d << "gcp/\n"                     // ground control points
        << slash(des) << "\n"                // processing core description files
        << slash(des) << "\n"                // further description files
        << slash(des) << "\n"                // XML schemas
        << "LSBFirst\n"                      // byte order of written rasters ("MSBFirst": big-endian)
        << (request.tracing ? "ACTIVE" : "INACTIVE") << "\n"
        << "\n"                              // reserved
        << "NaN\n";                          // null value of rasters
  }

  std::vector<std::string> args = default_arguments(dir);
  for (std::size_t i = 0; i < request.arguments.size() && i < args.size(); ++i)
    if (!request.arguments[i].empty()) args[i] = request.arguments[i];
  const fs::path list = dir / "job.txt";
  {
    std::ofstream out(list, std::ios::trunc);
    out << "job list for " << mode.prefix << " (this first line is not read)\n";
    for (const auto& a : args) out << a << "\n";
    out << "#\n";
  }
  std::ofstream(dir / "Vanterra.working", std::ios::trunc) << "0\n-\n";
  std::error_code ec;
  fs::remove(dir / "Vanterra.working_error", ec);
  fs::remove(dir / "Vanterra.working_tmp", ec);
  (void)mode.parameterFile;
  return list.string();
}

namespace {

// "N=VALUE" with N a job argument's index.
CLI::Validator job_argument() {
  return CLI::Validator(
      [](std::string& text) -> std::string {
        const auto eq = text.find('=');
        std::string index = text.substr(0, eq);
        if (eq == std::string::npos ||
            !base::cli::whole_number(0, static_cast<long long>(kMinJobArguments) - 1)(index).empty())
          return "takes N=VALUE with N from 0 to " + std::to_string(kMinJobArguments - 1) + ", not '" + text + "'";
        return {};
      },
      "N=VALUE");
}

// A refusal of the command line in the one style of the engine's programs.
int refuse(const char* command, const std::string& error) {
  std::fprintf(stderr, "focussing %s: %s; see focussing %s --help\n", command, error.c_str(), command);
  return 2;
}

}  // namespace

int aux_index_main(int argc, char** argv) {
  std::string desDir;
  std::vector<std::string> dirs;
  const auto app = base::cli::make_app("focussing --aux-index", "focussing --aux-index DESDIR AUXDIR...",
                                       "Index the ASA_INS/ASA_XCA/ASA_XCH products of the archives AUXDIR (searched\n"
                                       "recursively) by validity, into the job's description folder DESDIR.");
  app->add_option("DESDIR", desDir, "description folder that receives the index");
  base::cli::shown_as(app->add_option("AUXDIR", dirs, "archive folder of auxiliary products"), "AUXDIR...");
  const auto parsed = base::cli::parse(*app, std::vector<std::string>(argv, argv + std::max(argc, 0)));
  if (parsed.help) {
    std::fputs(app->help().c_str(), stdout);
    return 0;
  }
  std::string error = parsed.error;
  if (error.empty() && (desDir.empty() || dirs.empty())) error = "needs a description folder and at least one archive";
  if (!error.empty()) return refuse("--aux-index", error);
  const auto entries = scan_aux_products(dirs);
  write_aux_index(entries, slash(fs::absolute(desDir)));
  std::printf("%zu auxiliary products indexed in %s%s\n", entries.size(), slash(fs::absolute(desDir)).c_str(),
              std::string(kAuxIndexFile).c_str());
  return 0;
}

int setup_main(int argc, char** argv) {
  SetupRequest req;
  std::vector<std::string> jobArguments;
  const auto app = base::cli::make_app(
      "focussing --setup", "focussing --setup DIR [--mode IM|AP|WS|RS|WSS] [--data DIR] [--aux DIR]... [--trace] [--arg N=VALUE]...",
      "Lay out a working directory for one job run by hand: the configuration file, a description\n"
      "folder with the shipped parameter files and catalogues, the working file and the job list.");
  app->add_option("DIR", req.dir, "working directory to create");
  base::cli::shown_as(app->add_option("--mode", req.mode, "the job's mode (default IM)")
                          ->check(base::cli::one_of({"IM", "AP", "WS", "RS", "WSS"})),
                      "MODE");
  base::cli::shown_as(app->add_option("--data", req.dataDir, "shipped data folder (default: the build's own)"), "DIR");
  base::cli::shown_as(app->add_option("--aux", req.auxDirs,
                                      "archive of ASA_INS/ASA_XCA/ASA_XCH products to index (default: the\n"
                                      "shipped index)")
                          ->allow_extra_args(false),
                      "DIR");
  app->add_flag("--trace", req.tracing, "trace the job (Vanterra.trace)");
  base::cli::shown_as(app->add_option("--arg", jobArguments,
                                      "job argument N of the list (0 to " + std::to_string(kMinJobArguments - 1) +
                                          "); the others are NotOK or defaults")
                          ->check(job_argument())
                          ->allow_extra_args(false),
                      "N=VALUE");
  const auto parsed = base::cli::parse(*app, std::vector<std::string>(argv, argv + std::max(argc, 0)));
  if (parsed.help) {
    std::fputs(app->help().c_str(), stdout);
    return 0;
  }
  std::string error = parsed.error;
  if (error.empty() && req.dir.empty()) error = "no working directory given";
  if (!error.empty()) return refuse("--setup", error);
  for (const std::string& a : jobArguments) {
    const auto eq = a.find('=');
    const auto n = static_cast<std::size_t>(std::stoi(a.substr(0, eq)));
    if (req.arguments.size() <= n) req.arguments.resize(n + 1);
    req.arguments[n] = a.substr(eq + 1);
  }
  try {
    const std::string list = setup_working_dir(req);
    const std::string dir = fs::absolute(req.dir).string();
    std::printf("Working directory laid out in %s\n", dir.c_str());
    std::printf("Edit the job list %s, then run:\n", list.c_str());
    std::printf("  VANTERRA_INIT_DIR=%s focussing \"%s\"\n", dir.c_str(), command_for(req.mode, list).c_str());
    return 0;
  } catch (const std::exception& e) {
    std::fprintf(stderr, "focussing --setup: %s\n", e.what());
    return 2;
  }
}

}  // namespace sar::jobs

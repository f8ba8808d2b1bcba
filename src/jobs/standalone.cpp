#include "jobs/standalone.hpp"

#include <fcntl.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <sstream>
#include <stdexcept>
#include <thread>

#include "base/convert.hpp"
#include "base/run_services.hpp"
#include "jobs/discovery.hpp"
#include "jobs/setup.hpp"

namespace sar::jobs {
namespace fs = std::filesystem;

namespace {

struct ModeRow {
  const char* name;   // command-line mode
  const char* setup;  // setup mode
  bool built;         // the processing chain stands
};
constexpr ModeRow kModes[] = {
    {"im", "IM", true}, {"ap", "AP", false}, {"ws", "WS", false}, {"rs", "RS", false}, {"wss", "WSS", false}};

const ModeRow* find_mode(const std::string& m) {
  for (const auto& r : kModes)
    if (m == r.name) return &r;
  return nullptr;
}

std::vector<std::string> read_lines(const fs::path& p) {
  std::vector<std::string> out;
  std::ifstream in(p);
  for (std::string l; std::getline(in, l);) out.push_back(l);
  return out;
}

std::string trim(const std::string& s) {
  const auto b = s.find_first_not_of(" \t\r");
  if (b == std::string::npos) return {};
  return s.substr(b, s.find_last_not_of(" \t\r") - b + 1);
}

StandaloneOutcome fail(std::string message, int status = 2) {
  StandaloneOutcome o;
  o.status = status;
  o.summary = "sarfocus: " + std::move(message);
  return o;
}

// Progress display: a redrawn bar on a terminal, a line per change elsewhere.
class ProgressView {
 public:
  explicit ProgressView(std::FILE* out) : out_(out), tty_(out && ::isatty(::fileno(out))) {}
  void show(int percent, const std::string& label) {
    if (!out_ || (percent == last_ && label == label_)) return;
    last_ = percent;
    label_ = label;
    const int p = std::clamp(percent, 0, 100);
    if (tty_) {
      const int filled = p * 30 / 100;
      std::fprintf(out_, "\r[%s%s] %3d%% %-50.50s", std::string(filled, '#').c_str(),
                   std::string(30 - filled, ' ').c_str(), p, label.c_str());
    } else {
      std::fprintf(out_, "%3d%% %s\n", p, label.c_str());
    }
    std::fflush(out_);
  }
  void done() {
    if (out_ && tty_ && last_ >= 0) std::fprintf(out_, "\n");
  }

 private:
  std::FILE* out_;
  bool tty_;
  int last_ = -1;
  std::string label_;
};

int run_child(const std::string& exe, const std::string& command, const fs::path& workDir, int threads,
              const fs::path& workingFile, ProgressView& view) {
  const pid_t pid = ::fork();
  if (pid < 0) return -1;
  if (pid == 0) {
    ::setenv("VANTERRA_INIT_DIR", workDir.c_str(), 1);
    if (threads > 0) ::setenv("OMP_NUM_THREADS", std::to_string(threads).c_str(), 1);
    const int fd = ::open((workDir / "focussing.out").c_str(), O_WRONLY | O_CREAT | O_TRUNC, 0644);
    if (fd >= 0) {
      ::dup2(fd, 1);
      ::dup2(fd, 2);
      ::close(fd);
    }
    if (::chdir(workDir.c_str()) != 0) ::_exit(127);
    ::execl(exe.c_str(), exe.c_str(), command.c_str(), static_cast<char*>(nullptr));
    ::_exit(127);
  }
  int raw = 0;
  for (;;) {
    const pid_t r = ::waitpid(pid, &raw, WNOHANG);
    if (r == pid) break;
    const auto lines = read_lines(workingFile);
    if (lines.size() >= 2 && !lines[0].empty() && lines[0][0] != '-')
      view.show(std::atoi(lines[0].c_str()), trim(lines[1]));
    std::this_thread::sleep_for(std::chrono::milliseconds(200));
  }
  view.done();
  return WIFEXITED(raw) ? WEXITSTATUS(raw) : 128 + WTERMSIG(raw);
}

bool writable_dir(const fs::path& dir) {
  std::error_code ec;
  fs::create_directories(dir, ec);
  const fs::path probe = dir / ".sarfocus_write_probe";
  {
    std::ofstream f(probe);
    if (!f) return false;
  }
  fs::remove(probe, ec);
  return true;
}

}  // namespace

std::string apply_parameter_overrides(const std::string& parameterFile, const std::vector<std::string>& overrides) {
  std::vector<std::string> lines = read_lines(parameterFile);
  for (const auto& o : overrides) {
    const auto eq = o.find('=');
    if (eq == std::string::npos) return "parameter override '" + o + "' is not KEY=VALUE";
    std::string key = trim(o.substr(0, eq));
    std::string section;
    if (const auto dot = key.find('.'); dot != std::string::npos) {
      section = key.substr(0, dot);
      key = key.substr(dot + 1);
    }
    const std::string value = trim(o.substr(eq + 1));
    std::string current;
    bool done = false;
    for (auto& line : lines) {
      const std::string t = trim(line);
      if (!t.empty() && t.front() == '[') {
        current = trim(t.substr(1, t.find(']') - 1));
        continue;
      }
      const auto leq = t.find('=');
      if (leq == std::string::npos || trim(t.substr(0, leq)) != key) continue;
      if (!section.empty() && section != current) continue;
      line = key + " = " + value;
      done = true;
      break;
    }
    if (!done) return "the parameter file has no key '" + o.substr(0, eq) + "'";
  }
  std::ofstream out(parameterFile, std::ios::trunc);
  for (const auto& l : lines) out << l << '\n';
  return {};
}

StandaloneOutcome run_standalone(const StandaloneRequest& req, const std::string& focussingExe, std::FILE* progress) {
  const ModeRow* mode = find_mode(req.mode);
  if (!mode) return fail("unknown mode '" + req.mode + "' (im, ap, ws, rs or wss)");
  if (!fs::is_regular_file(req.product)) return fail("product not found: " + req.product);
  if (!mode->built)
    return fail("mode '" + req.mode + "' is not available in this build yet (only im runs end to end)", 3);

  std::string orbit = "NotOK";
  if (!req.orbit.empty()) {
    if (fs::is_directory(req.orbit)) {
      const auto start = product_sensing_start(req.product);
      if (!start) return fail("cannot read the sensing start of " + req.product);
      const auto chosen = choose_orbit(scan_orbit_products(req.orbit), *start);
      if (!chosen) {
        std::string when;
        base::sec852myascii(*start, when);
        return fail("no orbit file in " + req.orbit + " covers the product's sensing start " + when);
      }
      orbit = chosen->path;
    } else if (fs::is_regular_file(req.orbit)) {
      orbit = req.orbit;
    } else {
      return fail("orbit not found: " + req.orbit);
    }
  }
  if (!req.auxDir.empty() && !fs::is_directory(req.auxDir)) return fail("auxiliary folder not found: " + req.auxDir);

  const fs::path out = fs::absolute(req.outDir);
  if (!writable_dir(out)) return fail("output directory " + out.string() + " is not writable");
  const std::string stem = fs::path(req.product).stem().string();
  const fs::path work = out / ".sarfocus" / stem;
  const std::string root = (out / stem).string();

  SetupRequest setup;
  setup.dir = work.string();
  setup.mode = mode->setup;
  setup.tracing = req.tracing;
  if (!req.auxDir.empty()) setup.auxDirs.push_back(req.auxDir);
  setup.arguments = {fs::absolute(req.product).string(), orbit, "NotOK", "NotOK", root,
                     std::to_string(req.quickLookWidth), std::to_string(req.quickLookHeight), "NotOK", "0", "0",
                     "NotOK", "NotOK", "OK", "1.0"};
  std::string list;
  try {
    fs::remove_all(work);
    list = setup_working_dir(setup);
  } catch (const std::exception& e) {
    return fail(std::string("cannot lay out the working directory: ") + e.what());
  }
  const std::string paramFile = (work / "des" / ("parameters_" + std::string(mode->setup) + ".hdr")).string();
  std::vector<std::string> overrides;
  if (!req.paramsFile.empty()) {
    std::string section;
    std::ifstream in(req.paramsFile);
    if (!in) return fail("parameter file not found: " + req.paramsFile);
    for (std::string l; std::getline(in, l);) {
      const std::string t = trim(l);
      if (!t.empty() && t.front() == '[') section = trim(t.substr(1, t.find(']') - 1));
      else if (t.find('=') != std::string::npos && !section.empty()) overrides.push_back(section + "." + t);
    }
  }
  overrides.insert(overrides.end(), req.params.begin(), req.params.end());
  if (const std::string err = apply_parameter_overrides(paramFile, overrides); !err.empty()) return fail(err);

  ProgressView view(progress);
  const int status =
      run_child(focussingExe, command_for(mode->setup, list), work, req.threads, work / "Vanterra.working", view);

  StandaloneOutcome o;
  o.workDir = work.string();
  o.status = status;
  for (const char* suffix : {"_slc", "_slc_hdr", "_slc.sml", "_slc.hdr", "_slc.vrt", "_slc.tif", "_slc.kml",
                             "_slc.xml"})
    if (fs::exists(root + suffix)) o.products.push_back(root + suffix);

  const auto record = read_lines(work / "Vanterra.working_error");
  const std::string log = (work / "Vanterra.log").string();
  if (status == 127) {
    o.summary = "sarfocus: cannot run " + focussingExe;
  } else if (status != 0 || (!record.empty() && record[0] == "-1")) {
    std::string text = "no error record";
    if (record.size() > 2) {
      const std::string second = trim(record[2]);
      text = record[1] + (second.front() == '[' ? " " : ": ") + second;
    }
    for (std::size_t i = 3; i < record.size() && !trim(record[i]).empty(); ++i) text += " " + trim(record[i]);
    o.summary = "sarfocus: FAILED: " + text + "; log: " + log;
    if (o.status == 0) o.status = 1;
  } else {
    std::string list2;
    for (const auto& p : o.products) list2 += (list2.empty() ? "" : ", ") + p;
    o.summary = "sarfocus: done" + std::string(record.empty() ? "" : " with warnings") + ": " +
                (list2.empty() ? std::string("no products") : list2);
  }
  return o;
}

namespace {

const char* kUsage =
    "usage: sarfocus MODE PRODUCT [options]\n"
    "  MODE       im (image mode); ap, ws, rs, wss are not available yet\n"
    "  PRODUCT    level 0 product (ENVISAT .N1)\n"
    "options:\n"
    "  --orbit FILE|DIR     orbit file, or a folder to choose the covering one from\n"
    "                       (DOR_VOR before DOR_POR, AUX_FPO, AUX_FRO)\n"
    "  --aux DIR            folder of ASA_INS/ASA_XCA/ASA_XCH products (default: the shipped index)\n"
    "  --out DIR            output folder (default: .); work files go to DIR/.sarfocus/<product>\n"
    "  --quicklook WxH      quick-look size (default 1024x1024)\n"
    "  --threads N          worker threads (default: all cores)\n"
    "  --param KEY=VALUE    override a processing parameter (Section.Key=VALUE when ambiguous)\n"
    "  --params FILE        override parameters from a file of [Section] and Key = Value lines\n"
    "  --trace              keep a trace of the run in the work folder\n"
    "  --help, --version\n";

std::string self_dir() {
  std::error_code ec;
  const fs::path exe = fs::read_symlink("/proc/self/exe", ec);
  return ec ? std::string(".") : exe.parent_path().string();
}

}  // namespace

int sarfocus_main(int argc, char** argv) {
  if (argc < 2 || std::strcmp(argv[1], "--help") == 0 || std::strcmp(argv[1], "-h") == 0) {
    std::fputs(kUsage, argc < 2 ? stderr : stdout);
    return argc < 2 ? 2 : 0;
  }
  if (std::strcmp(argv[1], "--version") == 0) {
    std::printf("sarfocus, engine %s\n", std::string(base::kVersionText).c_str());
    return 0;
  }
  StandaloneRequest req;
  req.mode = argv[1];
  try {
    int i = 2;
    if (i < argc && argv[i][0] != '-') req.product = argv[i++];
    for (; i < argc; ++i) {
      const std::string a = argv[i];
      auto value = [&]() -> std::string {
        if (i + 1 >= argc) throw std::invalid_argument(a + " needs a value");
        return argv[++i];
      };
      if (a == "--orbit") req.orbit = value();
      else if (a == "--aux") req.auxDir = value();
      else if (a == "--out") req.outDir = value();
      else if (a == "--threads") req.threads = std::stoi(value());
      else if (a == "--param") req.params.push_back(value());
      else if (a == "--params") req.paramsFile = value();
      else if (a == "--trace") req.tracing = true;
      else if (a == "--quicklook") {
        const std::string v = value();
        const auto x = v.find('x');
        if (x == std::string::npos) throw std::invalid_argument("--quicklook takes WxH");
        req.quickLookWidth = std::stoi(v.substr(0, x));
        req.quickLookHeight = std::stoi(v.substr(x + 1));
      } else if (a == "--help") {
        std::fputs(kUsage, stdout);
        return 0;
      } else {
        throw std::invalid_argument("unknown option " + a);
      }
    }
    if (req.product.empty()) throw std::invalid_argument("no product given");
  } catch (const std::exception& e) {
    std::fprintf(stderr, "sarfocus: %s\n%s", e.what(), kUsage);
    return 2;
  }
  const StandaloneOutcome o = run_standalone(req, self_dir() + "/focussing", stderr);
  std::fprintf(o.status == 0 ? stdout : stderr, "%s\n", o.summary.c_str());
  return o.status;
}

}  // namespace sar::jobs

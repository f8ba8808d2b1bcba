#include "jobs/standalone.hpp"

#include <fcntl.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <cstdlib>
#include <cstring>
#include <ctime>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <memory>
#include <mutex>
#include <optional>
#include <sstream>
#include <stdexcept>
#include <thread>

#include "base/command_line.hpp"
#include "base/errors.hpp"
#include "base/run_services.hpp"
#include "jobs/batch.hpp"
#include "jobs/discovery.hpp"
#include "jobs/im_job.hpp"
#include "jobs/multilook_step.hpp"
#include "jobs/setup.hpp"

extern char** environ;

namespace sar::jobs {
namespace fs = std::filesystem;

namespace {

struct ModeRow {
  const char* name;   // command-line mode
  const char* setup;  // setup mode
  const char* title;  // what it focuses
  bool orbit;         // the job takes an orbit file
};
constexpr ModeRow kModes[] = {{"im", "IM", "ENVISAT ASAR image mode level 0 (ASA_IM__0P)", true},
                              {"ap", "AP", "ENVISAT ASAR alternating polarisation level 0 (ASA_AP__0P)", true},
                              {"ws", "WS", "ENVISAT ASAR wide swath level 0 (ASA_WS__0P)", true},
                              {"rs", "RS", "RADARSAT-1 CEOS raw product", false},
                              {"wss", "WSS", "ENVISAT ASAR wide swath single-look level 1 (ASA_WSS_1P), multilooked", true}};

const ModeRow* find_mode(std::string_view m) {
  for (const auto& r : kModes)
    if (m == r.name) return &r;
  return nullptr;
}

// The stems of the SLCs a focusing job of `mode` writes for `product`: "<stem>" for one image,
// "<stem>_hv" and "<stem>_hh" (the pair of the sub-mode) for alternating polarisation.
std::vector<std::string> image_stems(std::string_view mode, const std::string& product, const std::string& stem) {
  if (mode != "ap") return {stem};
  std::vector<std::string> stems;
  try {
    for (const std::string& word : ap_images(product)) stems.push_back(stem + "_" + word);
  } catch (const base::CErrorExceptionManager&) {
    // Not an AP product: the job itself will say so.
  }
  return stems;
}

// The modes as the overview lists them, one a line.
std::string mode_list() {
  std::string list;
  for (const auto& m : kModes) {
    const std::string name = m.name;
    list += "  " + name + std::string(name.size() < 6 ? 6 - name.size() : 1, ' ') + m.title + "\n";
  }
  return list;
}

// "im, ap, ws, rs or wss".
std::string mode_names() {
  std::string names;
  for (std::size_t i = 0; i < std::size(kModes); ++i)
    names += std::string(i == 0 ? "" : i + 1 == std::size(kModes) ? " or " : ", ") + kModes[i].name;
  return names;
}

// Log text of a stage that this build does not hold.
constexpr std::string_view kStageNotBuilt = "stage not available in this build";
// Width at which the error record wraps a detail.
constexpr std::size_t kRecordDetailWidth = 48;

std::vector<std::string> read_lines(const fs::path& p) {
  std::vector<std::string> out;
  std::ifstream in(p);
  for (std::string l; std::getline(in, l);) {
    if (!l.empty() && l.back() == '\r') l.pop_back();
    out.push_back(l);
  }
  return out;
}

std::string read_text(const fs::path& p) {
  std::ifstream in(p, std::ios::binary);
  std::ostringstream s;
  s << in.rdbuf();
  return s.str();
}

std::string trim(const std::string& s) {
  const auto b = s.find_first_not_of(" \t\r");
  if (b == std::string::npos) return {};
  return s.substr(b, s.find_last_not_of(" \t\r") - b + 1);
}

StandaloneOutcome bad_request(std::string message) {
  StandaloneOutcome o;
  o.status = kExitBadRequest;
  o.result = StandaloneResult::kBadRequest;
  o.error = message;
  o.summary = "sarfocus: " + std::move(message);
  return o;
}

// Progress display: a redrawn bar on a terminal, a line per change elsewhere.
class ProgressView {
 public:
  explicit ProgressView(std::FILE* out) : out_(out), tty_(out && ::isatty(::fileno(out))) {}
  bool active() const { return out_ != nullptr; }
  void show(int percent, const std::string& label) {
    if (!out_ || (percent == last_ && label == label_)) return;
    last_ = percent;
    label_ = label;
    const int p = std::clamp(percent, 0, 100);
    if (tty_) {
      const int filled = p * 30 / 100;
      std::fprintf(out_, "\r[%s%s] %3d%% %-50.50s", std::string(static_cast<std::size_t>(filled), '#').c_str(),
                   std::string(static_cast<std::size_t>(30 - filled), ' ').c_str(), p, label.c_str());
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

// Runs focussing in `workDir`. Everything the child needs is built before the fork: between
// fork and exec a threaded parent's child may only make async-signal-safe calls.
int run_child(const std::string& exe, const std::string& command, const fs::path& workDir, int threads,
              ProgressView& view, int& killedBy, std::string& activity) {
  killedBy = 0;
  std::vector<std::string> env;
  for (char** e = environ; e && *e; ++e) {
    const std::string_view v(*e);
    if (v.rfind("VANTERRA_INIT_DIR=", 0) == 0 || (threads > 0 && v.rfind("OMP_NUM_THREADS=", 0) == 0)) continue;
    env.emplace_back(v);
  }
  env.push_back("VANTERRA_INIT_DIR=" + workDir.string());
  if (threads > 0) env.push_back("OMP_NUM_THREADS=" + std::to_string(threads));
  std::vector<char*> envp;
  for (auto& e : env) envp.push_back(e.data());
  envp.push_back(nullptr);
  std::string exeCopy = exe, commandCopy = command;
  char* argv[] = {exeCopy.data(), commandCopy.data(), nullptr};
  const std::string outPath = (workDir / "focussing.out").string();
  const std::string dir = workDir.string();
  const fs::path workingFile = workDir / base::kDefaultWorkingFile;

  const pid_t pid = ::fork();
  if (pid < 0) return -1;
  if (pid == 0) {
    const int fd = ::open(outPath.c_str(), O_WRONLY | O_CREAT | O_TRUNC, 0644);
    if (fd >= 0) {
      ::dup2(fd, 1);
      ::dup2(fd, 2);
      if (fd > 2) ::close(fd);
    }
    if (::chdir(dir.c_str()) != 0) ::_exit(127);
    ::execve(argv[0], argv, envp.data());
    ::_exit(127);
  }
  int raw = 0;
  for (;;) {
    const pid_t r = ::waitpid(pid, &raw, WNOHANG);
    if (r == pid || (r < 0 && errno != EINTR)) break;
    // The activity is followed even without a view: a job killed outright is reported with it.
    const auto lines = read_lines(workingFile);
    // "0" and "-" stand in the working file until the job has said what it does.
    if (lines.size() >= 2 && !lines[0].empty() && lines[0][0] != '-' && trim(lines[1]) != "-") {
      activity = trim(lines[1]);
      if (view.active()) view.show(std::atoi(lines[0].c_str()), activity);
    }
    std::this_thread::sleep_for(std::chrono::milliseconds(100));
  }
  view.done();
  if (WIFSIGNALED(raw)) killedBy = WTERMSIG(raw);
  return WIFEXITED(raw) ? WEXITSTATUS(raw) : 128 + WTERMSIG(raw);
}

// Why a directory that exists cannot take new files; empty when it can. A directory without
// any write permission counts as read-only even for root, who could write into it anyway.
std::string unwritable_reason(const fs::path& dir) {
  struct stat st {};
  if (::stat(dir.c_str(), &st) != 0) return std::strerror(errno);
  if (!S_ISDIR(st.st_mode)) return dir.string() + " is not a directory";
  if (::access(dir.c_str(), W_OK | X_OK) != 0 || (st.st_mode & (S_IWUSR | S_IWGRP | S_IWOTH)) == 0)
    return "read-only";
  const std::string probe = (dir / ".sarfocus_write_probe").string();
  const int fd = ::open(probe.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_CLOEXEC, 0600);
  if (fd < 0) {
    if (errno == EEXIST) return {};  // another run is probing at this moment
    return std::strerror(errno);
  }
  ::close(fd);
  ::unlink(probe.c_str());
  return {};
}

// Make the output folder; the folders it had to create are listed (deepest last) so that a
// request refused later leaves nothing behind.
std::string prepare_output(const fs::path& out, std::vector<fs::path>& created) {
  fs::path existing = out;
  std::vector<fs::path> missing;
  std::error_code ec;
  while (!fs::exists(existing, ec) && existing.has_relative_path()) {
    missing.push_back(existing);
    existing = existing.parent_path();
  }
  if (std::string why = unwritable_reason(existing); !why.empty())
    return "output directory " + out.string() + " is not writable: " + why;
  for (auto it = missing.rbegin(); it != missing.rend(); ++it) {
    if (!fs::create_directory(*it, ec) && ec)
      return "output directory " + out.string() + " is not writable: " + ec.message();
    created.push_back(*it);
  }
  return {};
}

void remove_if_empty(const fs::path& dir) {
  std::error_code ec;
  if (fs::is_directory(dir, ec) && fs::is_empty(dir, ec)) fs::remove(dir, ec);
}

// Undo what a refused or unbuilt run put into the output folder.
void clean_up(const fs::path& work, const fs::path& out, const std::vector<fs::path>& created) {
  std::error_code ec;
  fs::remove_all(work, ec);
  remove_if_empty(out / ".sarfocus");
  for (auto it = created.rbegin(); it != created.rend(); ++it) remove_if_empty(*it);
}

// The job arguments of a mode (see the job list's table of arguments).
std::vector<std::string> job_arguments(const ModeRow& mode, const std::string& product, const std::string& orbit,
                                       const std::string& root, const StandaloneRequest& req) {
  std::vector<std::string> a(14, "NotOK");
  const std::string w = std::to_string(req.quickLookWidth), h = std::to_string(req.quickLookHeight);
  const std::string m = mode.setup;
  if (m == "RS") {
    a[0] = product;
    a[2] = root;
    a[3] = w;
    a[4] = h;
  } else if (m == "WSS") {
    a[0] = product;
    a[1] = root;
    a[2] = orbit;
    if (req.groundRange) a[6] = "OK";
  } else {
    a[0] = product;
    a[1] = orbit;
    a[4] = root;
    a[5] = w;
    a[6] = h;
    if (m == "WS") a[8] = a[9] = "0";
    if (m == "WS" && req.groundRange) a[11] = "OK";
  }
  a[12] = req.quickLook ? "OK" : "NotOK";
  a[13] = "1.0";
  return a;
}

// The error record as one line: primary text, secondary text with the code, then the details
// (a detail longer than a record line continues on the next one).
std::string record_text(const std::vector<std::string>& record) {
  if (record.size() < 3) return "no error record";
  const std::string second = trim(record[2]);
  std::string text = trim(record[1]) + (!second.empty() && second.front() == '[' ? " " : ": ") + second;
  bool continues = false;
  for (std::size_t i = 3; i < record.size(); ++i) {
    const std::string t = trim(record[i]);
    if (t.empty()) break;
    text += (continues ? "" : " ") + t;
    continues = record[i].size() == kRecordDetailWidth;
  }
  return text;
}

// The stage that the log reports as not built, or empty.
std::string unbuilt_stage(const std::string& log) {
  const auto at = log.find(kStageNotBuilt);
  if (at == std::string::npos || at < 2) return {};
  std::size_t end = at;
  while (end > 0 && (log[end - 1] == ' ' || log[end - 1] == ':')) --end;
  std::size_t begin = end;
  while (begin > 0 && log[begin - 1] != ' ' && log[begin - 1] != '\n') --begin;
  return log.substr(begin, end - begin);
}

std::string now_text() {
  const std::time_t t = std::time(nullptr);
  std::tm tm{};
  ::localtime_r(&t, &tm);
  char buf[32];
  std::strftime(buf, sizeof buf, "%Y-%m-%d %H:%M:%S", &tm);
  return buf;
}

// One file moved into the output folder; a rename where it can, else a copy.
bool move_into(const fs::path& from, const fs::path& to, std::string& error) {
  std::error_code ec;
  fs::rename(from, to, ec);
  if (!ec) return true;
  fs::copy_file(from, to, fs::copy_options::overwrite_existing, ec);
  if (!ec) fs::remove(from, ec);
  if (ec) error = "cannot move " + from.string() + " into " + to.parent_path().string() + ": " + ec.message();
  return !ec;
}

std::string quick_look_text(const StandaloneRequest& req) {
  return req.quickLook ? std::to_string(req.quickLookWidth) + "x" + std::to_string(req.quickLookHeight) : "no";
}

std::mutex& preparation_lock() {
  static std::mutex m;
  return m;
}

struct Prepared {
  const ModeRow* mode = nullptr;
  fs::path out, work;
  std::string stem, command;
  std::vector<fs::path> created;
};

// Everything before the job runs: inputs checked, the output folder made, the working
// directory laid out. An outcome is returned when nothing is to be run.
std::optional<StandaloneOutcome> prepare(const StandaloneRequest& req, Prepared& p) {
  p.mode = find_mode(req.mode);
  if (!p.mode) return bad_request("unknown mode '" + req.mode + "' (" + mode_names() + ")");
  if (!req.multilook.empty() && req.mode != "im" && req.mode != "ap")
    return bad_request("--multilook is for the stripmap modes im and ap");
  if (req.multilook.empty() && req.mode != "wss" && req.mode != "ws" && (req.groundRange || req.groundStep > 0.0))
    return bad_request("--ground-range and --ground-step go with --multilook (or modes ws and wss)");
  std::error_code ec;
  if (req.product.empty() || !(p.mode->setup == std::string("RS") ? fs::exists(req.product, ec)
                                                                    : fs::is_regular_file(req.product, ec)))
    return bad_request("product not found: " + req.product);
  const std::string product = fs::absolute(req.product).string();

  std::string orbit = "NotOK";
  if (!req.orbit.empty() && p.mode->orbit) {
    if (fs::is_directory(req.orbit, ec)) {
      std::string why;
      const auto chosen = find_orbit_for(product, req.orbit, why);
      if (!chosen) return bad_request(why);
      orbit = fs::absolute(chosen->path).string();
    } else if (fs::is_regular_file(req.orbit, ec)) {
      orbit = fs::absolute(req.orbit).string();
    } else {
      return bad_request("orbit not found: " + req.orbit);
    }
  }
  if (!req.auxDir.empty() && !fs::is_directory(req.auxDir, ec))
    return bad_request("auxiliary folder not found: " + req.auxDir);

  std::vector<std::string> overrides;
  if (!req.paramsFile.empty()) {
    std::ifstream in(req.paramsFile);
    if (!in) return bad_request("parameter file not found: " + req.paramsFile);
    std::string section;
    for (std::string l; std::getline(in, l);) {
      const std::string t = trim(l);
      if (!t.empty() && t.front() == '[') section = trim(t.substr(1, t.find(']') - 1));
      else if (t.find('=') != std::string::npos && !section.empty()) overrides.push_back(section + "." + t);
    }
  }
  overrides.insert(overrides.end(), req.params.begin(), req.params.end());

  p.out = fs::absolute(req.outDir).lexically_normal();
  if (p.out.has_relative_path() && !p.out.has_filename()) p.out = p.out.parent_path();
  p.stem = product_stem(product);
  p.work = working_dir_for(p.out.string(), product);
  if (std::string why = prepare_output(p.out, p.created); !why.empty()) {
    clean_up(p.work, p.out, p.created);
    return bad_request(why);
  }
  if (req.skipComplete && outputs_complete(req)) {
    StandaloneOutcome o;
    o.result = StandaloneResult::kSkipped;
    o.workDir = p.work.string();
    o.slc = (p.out / (p.stem + "_slc")).string();
    for (const auto& line : read_lines(p.work / kCompletionMarker))
      if (line.rfind("output = ", 0) == 0) {
        const std::string rest = line.substr(9);
        o.products.push_back((p.out / rest.substr(0, rest.rfind(' '))).string());
      }
    o.summary = "sarfocus: skipped, the outputs of an earlier run are complete: " + o.slc;
    return o;
  }

  SetupRequest setup;
  setup.dir = p.work.string();
  setup.mode = p.mode->setup;
  setup.tracing = req.tracing;
  if (!req.auxDir.empty()) setup.auxDirs.push_back(fs::absolute(req.auxDir).string());
  setup.arguments = job_arguments(*p.mode, product, orbit, (p.work / p.stem).string(), req);
  try {
    fs::remove_all(p.work);  // an earlier run's files, its completion marker first of all
    const std::string list = setup_working_dir(setup);
    p.command = command_for(p.mode->setup, list);
  } catch (const std::exception& e) {
    clean_up(p.work, p.out, p.created);
    return bad_request(std::string("cannot lay out the working directory: ") + e.what());
  }
  const std::string parameterFile = setup.mode == "WSS" ? "parameters_multilook.hdr"
                                                        : "parameters_" + std::string(p.mode->setup) + ".hdr";
  if (std::string why = apply_parameter_overrides((p.work / "des" / parameterFile).string(), overrides);
      !why.empty()) {
    clean_up(p.work, p.out, p.created);
    return bad_request(why);
  }
  return std::nullopt;
}

// Products into the output folder, work files away, then the marker: a run that stops in
// between leaves no marker, so the product counts as not done.
std::string finish_success(const StandaloneRequest& req, const Prepared& p, StandaloneOutcome& o) {
  std::vector<fs::path> made;
  std::error_code ec;
  for (const auto& e : fs::directory_iterator(p.work, ec)) {
    const std::string name = e.path().filename().string();
    if (e.is_regular_file() && name.rfind(p.stem + "_", 0) == 0) made.push_back(e.path());
  }
  std::sort(made.begin(), made.end());
  std::string error;
  std::ostringstream marker;
  marker << "sarfocus completion marker, written after the products were moved into the output folder\n"
         << "mode = " << p.mode->name << "\nproduct = " << fs::absolute(req.product).string()
         << "\nquicklook = " << quick_look_text(req) << "\nfinished = " << now_text() << "\n";
  for (const auto& from : made) {
    const fs::path to = p.out / from.filename();
    if (!move_into(from, to, error)) return error;
    o.products.push_back(to.string());
    marker << "output = " << to.filename().string() << " " << fs::file_size(to, ec) << "\n";
    const std::string name = to.filename().string();
    if (o.slc.empty() && name.size() > 4 && name.compare(name.size() - 4, 4, "_slc") == 0) o.slc = to.string();
  }
  // The job's rasters of intermediate steps are of no use once the products stand.
  for (const auto& e : fs::directory_iterator(p.work, ec)) {
    const std::string name = e.path().filename().string();
    const bool keep = e.is_directory() || name.rfind("Vanterra", 0) == 0 || name == "job.txt" ||
                      name == "focussing.out" || name == "DCEST_resume.txt" || name == p.stem + "ML.lst";
    if (!keep) fs::remove(e.path(), ec);
  }
  const fs::path tmp = p.work / (std::string(kCompletionMarker) + ".tmp");
  {
    std::ofstream out(tmp, std::ios::trunc);
    out << marker.str();
    if (!out.flush()) return "cannot write the completion marker in " + p.work.string();
  }
  fs::rename(tmp, p.work / kCompletionMarker, ec);
  if (ec) return "cannot write the completion marker in " + p.work.string() + ": " + ec.message();
  return {};
}

}  // namespace

std::string product_stem(const std::string& product) {
  fs::path p(product);
  if (!p.has_filename()) p = p.parent_path();
  return p.stem().string();
}

std::string working_dir_for(const std::string& outDir, const std::string& product) {
  return (fs::absolute(outDir).lexically_normal() / ".sarfocus" / product_stem(product)).string();
}

std::string output_dir_problem(const std::string& outDir) {
  fs::path existing = fs::absolute(outDir).lexically_normal();
  std::error_code ec;
  while (!fs::exists(existing, ec) && existing.has_relative_path()) existing = existing.parent_path();
  if (std::string why = unwritable_reason(existing); !why.empty())
    return "output directory " + fs::absolute(outDir).string() + " is not writable: " + why;
  return {};
}

bool known_mode(std::string_view mode) { return find_mode(mode) != nullptr; }

bool outputs_complete(const StandaloneRequest& req) {
  const fs::path out = fs::absolute(req.outDir).lexically_normal();
  const fs::path work = working_dir_for(out.string(), req.product);
  const std::string stem = product_stem(req.product);
  std::vector<std::string> required;
  for (const std::string& image : image_stems(req.mode, req.product, stem)) {
    required.push_back(image + "_slc");
    required.push_back(image + "_slc_hdr");
    if (req.quickLook) required.push_back(image + "_slc.tif");
    if (!req.multilook.empty() && req.mode == "ap") required.push_back(looked_product_name(image, req.groundRange));
  }
  if (req.mode == "wss" || req.mode == "ws") {
    // The wide swath jobs leave a multilooked image only.
    const std::string image = looked_product_name(stem, req.groundRange);
    required = {image, image + "_hdr"};
    if (req.quickLook) required.push_back(image + ".tif");
  }
  if (!req.multilook.empty() && req.mode != "ap") required.push_back(looked_product_name(stem, req.groundRange));
  bool modeOk = false, productOk = false;
  std::size_t found = 0;
  for (const auto& line : read_lines(work / kCompletionMarker)) {
    const auto eq = line.find(" = ");
    if (eq == std::string::npos) continue;
    const std::string key = line.substr(0, eq), value = line.substr(eq + 3);
    if (key == "mode") modeOk = value == req.mode;
    if (key == "product") productOk = fs::path(value).filename() == fs::path(req.product).filename();
    const auto blank = value.rfind(' ');
    if (key != "output" || blank == std::string::npos) continue;
    const std::string name = value.substr(0, blank);
    if (std::find(required.begin(), required.end(), name) == required.end()) continue;
    std::error_code ec;
    const auto size = fs::file_size(out / name, ec);
    if (ec || std::to_string(size) != value.substr(blank + 1)) return false;
    ++found;
  }
  return modeOk && productOk && found == required.size();
}

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
  Prepared p;
  {
    // Layout and discovery touch shared folders (the output folder, the shipped data); one
    // product at a time prepares, the jobs themselves then run side by side.
    std::lock_guard<std::mutex> lock(preparation_lock());
    if (auto early = prepare(req, p)) return *early;
  }

  ProgressView view(progress);
  const auto started = std::chrono::steady_clock::now();
  int killedBy = 0;
  std::string activity = "-";
  const int status = run_child(focussingExe, p.command, p.work, req.threads, view, killedBy, activity);
  StandaloneOutcome o;
  o.seconds = std::chrono::duration<double>(std::chrono::steady_clock::now() - started).count();
  o.workDir = p.work.string();
  o.status = status;

  const auto record = read_lines(p.work / "Vanterra.working_error");
  const std::string log = (p.work / base::kLogFile).string();
  if (status == 127 || status < 0) {
    o.result = StandaloneResult::kFailed;
    o.error = "cannot run " + focussingExe;
    o.summary = "sarfocus: " + o.error;
    if (o.status <= 0) o.status = 1;
    return o;
  }
  if (killedBy != 0) {
    // Killed outright: whatever error record stands is not about this end.
    const char* name = sigabbrev_np(killedBy);
    // The working file may have been cut short by the kill; then the last activity seen stands.
    const auto working = read_lines(p.work / base::kDefaultWorkingFile);
    if (working.size() >= 2 && !trim(working[1]).empty() && trim(working[1]) != "-") activity = trim(working[1]);
    o.result = StandaloneResult::kFailed;
    o.error = "focussing was killed by " + (name ? "SIG" + std::string(name) : "signal " + std::to_string(killedBy)) +
              " during '" + activity + "'";
    o.summary = "sarfocus: FAILED: " + o.error + "; log: " + log;
    return o;
  }
  if (status != 0 || (!record.empty() && record[0] == "-1")) {
    o.error = record_text(record);
    if (o.status == 0) o.status = 1;
    if (const std::string stage = unbuilt_stage(read_text(log)); !stage.empty()) {
      o.result = StandaloneResult::kNotBuilt;
      o.status = kExitNotBuilt;
      o.error = "mode '" + req.mode + "' is not available in this build yet: the job stopped at " + stage + " (" +
                std::string(kStageNotBuilt) + ")";
      o.summary = "sarfocus: " + o.error;
      std::lock_guard<std::mutex> lock(preparation_lock());
      clean_up(p.work, p.out, p.created);
      o.workDir.clear();
      return o;
    }
    o.result = StandaloneResult::kFailed;
    o.summary = "sarfocus: FAILED: " + o.error + "; log: " + log;
    return o;
  }
  if (!req.multilook.empty()) {
    StripLooksChoice looks;
    std::string why = parse_looks(req.multilook, looks);
    looks.groundRange = req.groundRange;
    looks.groundStep = req.groundStep;
    for (const std::string& image : image_stems(req.mode, req.product, p.stem))
      if (why.empty())
        why = multilook_slc((p.work / (image + "_slc")).string(),
                            (p.work / looked_product_name(image, req.groundRange)).string(), looks);
    if (!why.empty()) {
      o.result = StandaloneResult::kFailed;
      o.status = 1;
      o.error = why;
      o.summary = "sarfocus: FAILED: " + why;
      return o;
    }
  }
  if (std::string why = finish_success(req, p, o); !why.empty()) {
    o.result = StandaloneResult::kFailed;
    o.status = 1;
    o.error = why;
    o.summary = "sarfocus: FAILED: " + why;
    return o;
  }
  std::string list;
  for (const auto& f : o.products) list += (list.empty() ? "" : ", ") + f;
  o.summary = "sarfocus: done" + std::string(record.empty() ? "" : " with warnings") + ": " +
              (list.empty() ? std::string("no products") : list);
  return o;
}

// ------------------------------------------------------------------------- command line

namespace {

constexpr long long kMaxCount = 1000000;

// "WxH" with both sides whole numbers from 1.
CLI::Validator size_text() {
  return CLI::Validator(
      [](std::string& text) -> std::string {
        const auto x = text.find('x');
        std::string w = text.substr(0, x), h = x == std::string::npos ? "" : text.substr(x + 1);
        if (x == std::string::npos || !base::cli::whole_number(1, kMaxCount)(w).empty() ||
            !base::cli::whole_number(1, kMaxCount)(h).empty())
          return "takes WxH, two whole numbers from 1, not '" + text + "'";
        return {};
      },
      "WxH");
}

CLI::Validator key_value() {
  return CLI::Validator(
      [](std::string& text) -> std::string {
        return text.find('=') == std::string::npos ? "takes KEY=VALUE, not '" + text + "'" : std::string();
      },
      "KEY=VALUE");
}

CLI::Validator looks_text() {
  return CLI::Validator(
      [](std::string& text) -> std::string {
        StripLooksChoice looks;
        return parse_looks(text, looks);
      },
      "AZxRG");
}

const char* kOutputs =
    "Outputs: OUT/<product>_slc (the SLC), <product>_slc_hdr (its annotation), .sml, .hdr, .vrt,\n"
    "and <product>_slc.tif (the quick-look); with --multilook also <product>_pwr or _gr (float\n"
    "amplitude) with its .hdr, .vrt, _hdr and .sml. Work files, the log (Vanterra.log) and the error\n"
    "record (Vanterra.working_error) stay in OUT/.sarfocus/<product>/; after a successful run the\n"
    "marker sarfocus.complete there lists the outputs. The last line says what was written, or\n"
    "the error with its code and the log's path.\n";

// The command line of one mode; `req` receives what it parses.
std::unique_ptr<CLI::App> mode_app(const ModeRow& mode, StandaloneRequest& req) {
  auto app = base::cli::make_app("sarfocus " + std::string(mode.name),
                                 "sarfocus " + std::string(mode.name) + " PRODUCT [options]");
  app->add_option("PRODUCT", req.product,
                  std::string(mode.title) + (mode.orbit ? "" : "\n(this mode takes no orbit file: --orbit is ignored)"));
  add_standalone_options(*app, req);
  app->footer(kOutputs);
  app->allow_extras();  // refused below, in words that name the product
  return app;
}

}  // namespace

void add_standalone_options(CLI::App& app, StandaloneRequest& req) {
  using base::cli::shown_as;
  shown_as(app.add_option("--orbit", req.orbit,
                          "orbit file, or a folder to choose the covering one from (by header:\n"
                          "DOR_VOR before DOR_POR, AUX_FPO, AUX_FRO, then the newest issue)"),
           "FILE|DIR");
  shown_as(app.add_option("--aux", req.auxDir,
                          "folder of ASA_INS/ASA_XCA/ASA_XCH products, chosen by validity\n"
                          "(default: the shipped index data/ASA_AUX_list.dat)"),
           "DIR");
  shown_as(app.add_option("--out", req.outDir,
                          "output folder (default: .); work files go to DIR/.sarfocus/<product>/"),
           "DIR");
  // The quick-look options act in the order given: the last one counts.
  shown_as(app.add_option_function<std::string>(
                   "--quicklook",
                   [&req](const std::string& v) {
                     const auto x = v.find('x');
                     req.quickLookWidth = std::stoi(v.substr(0, x));
                     req.quickLookHeight = std::stoi(v.substr(x + 1));
                     req.quickLook = true;
                   },
                   "quick-look GeoTIFF size (default 1024x1024)")
               ->check(size_text())
               ->trigger_on_parse(),
           "WxH");
  app.add_flag_callback("--no-quicklook", [&req] { req.quickLook = false; }, "no quick-look")->trigger_on_parse();
  shown_as(app.add_option("--threads", req.threads, "worker threads of the job (default: all cores)")
               ->check(base::cli::whole_number(1, kMaxCount)),
           "N");
  shown_as(app.add_option("--param", req.params,
                          "override a processing parameter (Section.Key=VALUE when ambiguous)")
               ->check(key_value())
               ->allow_extra_args(false),
           "KEY=VALUE");
  shown_as(app.add_option("--params", req.paramsFile,
                          "override parameters from a file of [Section] and Key = Value lines"),
           "FILE");
  app.add_flag("--trace", req.tracing, "keep a trace of the run in the work folder");
  shown_as(app.add_option("--multilook", req.multilook,
                          "also a detected multilooked image, AZ lines by RG samples a look\n"
                          "(auto: the looks the annotation suggests); im and ap")
               ->check(looks_text()),
           "AZxRG");
  app.add_flag("--ground-range", req.groundRange,
               "the multilooked image in ground range (<product>_gr, else _pwr);\n"
               "ws and wss: their image in ground range");
  shown_as(app.add_option_function<int>(
                   "--ground-step", [&req](int step) { req.groundStep = step; },
                   "its ground step in metres (default: the looked slant cells' mean)")
               ->check(base::cli::whole_number(1, kMaxCount)),
           "M");
  app.add_flag("--skip-complete", req.skipComplete, "do nothing when an earlier run's outputs are complete");
}

std::string parse_standalone_options(const std::vector<std::string>& args, std::size_t first,
                                     StandaloneRequest& req, bool& help) {
  const ModeRow* mode = find_mode(req.mode);
  if (!mode) mode = &kModes[0];
  const auto app = mode_app(*mode, req);
  const auto parsed = base::cli::parse(
      *app, std::vector<std::string>(args.begin() + static_cast<std::ptrdiff_t>(std::min(first, args.size())), args.end()));
  help = parsed.help;
  if (!parsed.error.empty()) return parsed.error;
  for (const auto& word : parsed.extras) {
    if (!word.empty() && word[0] == '-' && word != "-") return "unknown option " + word;
    return "one product only (" + req.product + " and " + word + "); sarfocus batch takes many";
  }
  return {};
}

std::vector<std::string> standalone_options(const StandaloneRequest& req) {
  std::vector<std::string> a;
  auto add = [&](const char* option, const std::string& value) {
    a.emplace_back(option);
    a.push_back(value);
  };
  if (!req.orbit.empty()) add("--orbit", req.orbit);
  if (!req.auxDir.empty()) add("--aux", req.auxDir);
  add("--out", req.outDir);
  if (req.quickLook) add("--quicklook", quick_look_text(req));
  else a.emplace_back("--no-quicklook");
  if (req.threads > 0) add("--threads", std::to_string(req.threads));
  for (const auto& p : req.params) add("--param", p);
  if (!req.paramsFile.empty()) add("--params", req.paramsFile);
  if (req.tracing) a.emplace_back("--trace");
  if (!req.multilook.empty()) add("--multilook", req.multilook);
  if (req.groundRange) a.emplace_back("--ground-range");
  if (req.groundStep > 0.0) add("--ground-step", std::to_string(static_cast<int>(req.groundStep)));
  if (req.skipComplete) a.emplace_back("--skip-complete");
  return a;
}

namespace {

std::string overview() {
  return "usage: sarfocus MODE PRODUCT [options]   focus one product\n"
         "       sarfocus batch LIST|DIR [options] focus many products, or emit a Slurm or GNU parallel job\n"
         "       sarfocus help [MODE|batch]        help on a command (also: sarfocus MODE --help)\n"
         "       sarfocus --version                the engine's version text\n"
         "\n"
         "MODE is the acquisition mode of the product:\n" +
         mode_list() +
         "\n"
         "sarfocus lays out the host's files for each product in OUT/.sarfocus/<product>/, runs the\n"
         "engine's host entry `focussing` there, and moves the products into OUT once the job has\n"
         "succeeded. A mode whose processing chain this build does not hold yet says so.\n"
         "\n"
         "Exit status: 0 done (or skipped as complete), 2 bad command line or inputs, 3 mode not built\n"
         "yet, otherwise the failed job's own status. Run `sarfocus im --help` for the options.\n";
}

std::string self_dir() {
  std::error_code ec;
  const fs::path exe = fs::read_symlink("/proc/self/exe", ec);
  return ec ? std::string(".") : exe.parent_path().string();
}

}  // namespace

std::string sarfocus_help(std::string_view topic) {
  if (topic.empty()) return overview();
  if (topic == "batch") return batch_help();
  const ModeRow* m = find_mode(topic);
  if (!m) return {};
  StandaloneRequest unused;
  return mode_app(*m, unused)->help();
}

int sarfocus_run(const std::vector<std::string>& args, const SarfocusTools& tools, std::FILE* out, std::FILE* err) {
  if (args.empty()) {
    std::fputs(overview().c_str(), err);
    return kExitBadRequest;
  }
  const std::string& first = args[0];
  if (first == "--help" || first == "-h" || first == "help") {
    const std::string topic = first == "help" && args.size() > 1 ? args[1] : "";
    const std::string text = sarfocus_help(topic);
    if (text.empty()) {
      std::fprintf(err, "sarfocus: no help on '%s' (modes %s; batch)\n", topic.c_str(), mode_names().c_str());
      return kExitBadRequest;
    }
    std::fputs(text.c_str(), out);
    return 0;
  }
  if (first == "--version") {
    std::fprintf(out, "%s\n", std::string(base::kVersionText).c_str());
    return 0;
  }
  if (first == "batch") return batch_main(args, 1, tools, out, err);
  if (!known_mode(first)) {
    std::fprintf(err, "sarfocus: unknown mode '%s' (%s or batch); see sarfocus --help\n", first.c_str(),
                 mode_names().c_str());
    return kExitBadRequest;
  }
  StandaloneRequest req;
  req.mode = first;
  bool help = false;
  std::string error = parse_standalone_options(args, 1, req, help);
  if (help) {
    std::fputs(sarfocus_help(first).c_str(), out);
    return 0;
  }
  if (error.empty() && req.product.empty()) error = "no product given";
  if (!error.empty()) {
    std::fprintf(err, "sarfocus: %s; see sarfocus %s --help\n", error.c_str(), first.c_str());
    return kExitBadRequest;
  }
  const StandaloneOutcome o = run_standalone(req, tools.focussing, err);
  std::fprintf(o.status == 0 ? out : err, "%s\n", o.summary.c_str());
  return o.status;
}

int sarfocus_main(int argc, char** argv) {
  const std::vector<std::string> args(argv + 1, argv + argc);
  const std::string dir = self_dir();
  return sarfocus_run(args, {dir + "/focussing", dir + "/sarfocus"}, stdout, stderr);
}

}  // namespace sar::jobs

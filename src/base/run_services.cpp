#include "base/run_services.hpp"

#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <csignal>
#include <chrono>
#include <cmath>
#include <cstdarg>
#include <cstdio>
#include <cstdlib>
#include <ctime>
#include <filesystem>
#include <fstream>
#include <limits>
#include <sstream>
#include <thread>
#include <utility>

#include "base/arguments.hpp"
#include "base/diagnostics.hpp"

namespace sar::base {
namespace fs = std::filesystem;
namespace {

constexpr std::string_view kGenericWrongCode = "GENERIC ERROR WRONG CODE";
constexpr std::string_view kInitError = "AN ERROR OCCUR DURING Vanterra INIT";
constexpr std::size_t kFormatBuffer = 25000;
constexpr std::size_t kLabelMax = 80;
constexpr std::size_t kDetailLine = 48;   // characters of a detail line in the error record
constexpr std::size_t kDetailLines = 3;   // details in the error record
constexpr int kBannerWidth = 160;

// Names of the 14 positional configuration lines; empty for the reserved line.
constexpr std::string_view kConfigNames[14] = {
    "VANTERRA_KEY_FILES_DIR",         "VANTERRA_MANDATORY_DIR",       "VANTERRA_WORKING_DIR",
    "VANTERRA_EXE_DIR",               "VANTERRA_MAP_FILES_DIR",       "VANTERRA_CEOS_DES_FILES_DIR",
    "VANTERRA_GCP_DATABASE_DIR",      "VANTERRA_OMBRIX_DES_FILES_DIR", "VANTERRA_OTHER_01_DES_FILES_DIR",
    "VANTERRA_XML_SCHEMA_DES_FILES_DIR", "VANTERRA_DEFAULT_BYTE_ORDER", "VANTERRA_TRACING",
    "",                               "VANTERRA_DUMMY_VALUE"};

struct FileCloser {
  void operator()(std::FILE* f) const {
    if (f) std::fclose(f);
  }
};
using FilePtr = std::unique_ptr<std::FILE, FileCloser>;

struct RunState {
  bool up = false;  // the dictionary exists
  std::vector<std::pair<std::string, std::string>> dictionary;
  std::string version;
  std::string label = "-";
  FilePtr log;
  FilePtr trace;
  bool tracing = false;
  int traceLevel = kTraceThreshold;
  ErrorCatalogue errors;
  ErrorCatalogue warnings;
  bool errorsLoaded = false;
  bool warningRaised = false;
  std::string workingFile;
  std::string geoidPath;
  float dummyFloat = 0.0f;
  double dummyDouble = 0.0;
  int lastPercent = 0;
};

RunState& rs() {
  static RunState s;
  return s;
}

std::string with_separator(std::string dir) {
  if (!dir.empty() && dir.back() != '/' && dir.back() != '\\') dir.push_back(kPathSeparator);
  return dir;
}

const char* process_env(const char* name) {
  const char* v = std::getenv(name);
  return (v && *v) ? v : nullptr;
}

std::string vformat(const char* format, va_list args) {
  std::string out(kFormatBuffer, '\0');
  const int n = std::vsnprintf(out.data(), out.size(), format, args);
  out.resize(n < 0 ? 0 : std::min<std::size_t>(static_cast<std::size_t>(n), out.size() - 1));
  return out;
}

std::string stars() { return std::string(kBannerWidth, '*'); }

void sleep_seconds(double s) {
  if (s > 0) std::this_thread::sleep_for(std::chrono::duration<double>(s));
}

// Where host files go before the configuration has told us: the batch directory of the
// environment, else its working directory, else the current directory.
void provisional_working_file() {
  std::string dir;
  if (const char* b = process_env("VANTERRA_BATCH_DIR")) dir = with_separator(b);
  else if (const char* w = process_env("VANTERRA_WORKING_DIR")) dir = with_separator(w);
  const char* name = process_env("VANTERRA_WORKING_FILE");
  rs().workingFile = dir + (name ? name : std::string(kDefaultWorkingFile));
}

void close_trace() {
  RunState& s = rs();
  if (!s.trace) return;
  s.trace.reset();
  const std::string wd = working_dir();
  const std::string trace = wd + std::string(kTraceFile);
  const std::string save = wd + std::string(kTraceSaveFile);
  std::error_code ec;
  fs::remove(save, ec);
  fs::rename(trace, save, ec);
  if (ec) fs::copy_file(trace, save, fs::copy_options::overwrite_existing, ec);
  // Give a host that polls the folder time to see the saved trace.
  sleep_seconds(1.0);
}

void close_log() { rs().log.reset(); }

std::vector<std::string> read_lines(const std::string& path) {
  std::vector<std::string> lines;
  std::ifstream in(path, std::ios::binary);
  std::string line;
  while (std::getline(in, line)) {
    if (!line.empty() && line.back() == '\r') line.pop_back();
    lines.push_back(line);
  }
  return lines;
}

// The lines of an error record after its status line.
std::vector<std::string> record_lines(int32_t ec, std::span<const std::string> details) {
  std::string primary, secondary;
  if (ec == ec::kWarnings) GetWarningTexts(ec, primary, secondary);
  else GetErrorTexts(ec, primary, secondary);
  std::vector<std::string> lines{primary, secondary + " [EC : " + std::to_string(ec) + "]"};
  std::size_t budget = kDetailLine * kDetailLines;
  for (std::size_t i = 0; i < details.size() && i < kDetailLines && budget > 0; ++i) {
    std::string d = details[i];
    if (ec >= 261120 && ec <= 261126 && d.size() >= 4 && d.compare(d.size() - 4, 4, "_hdr") == 0)
      d.replace(d.size() - 4, 4, ".sml");
    d = d.substr(0, budget);
    budget -= d.size();
    std::string wrapped;
    for (std::size_t p = 0; p < d.size(); ++p) {
      if (p > 0 && p % kDetailLine == 0 && d.size() - p >= 6) wrapped.push_back('\n');
      wrapped.push_back(d[p]);
    }
    lines.push_back(wrapped);
  }
  lines.emplace_back(66, ' ');
  lines.emplace_back(66, ' ');
  return lines;
}

bool write_lines(const std::string& path, const std::vector<std::string>& lines) {
  std::ofstream out(path, std::ios::binary | std::ios::trunc);
  for (const auto& l : lines) out << l << '\n';
  return static_cast<bool>(out);
}

[[noreturn]] void interrupted() {
  TracePrintf("\n EXECUTION INTERRUPTED BY OPERATOR\n");
  fatal(ec::kInterrupted);
}

volatile std::sig_atomic_t noted_signal = 0;
bool stop_reported = false;

const char* signal_name(int s) {
  switch (s) {
    case SIGTERM: return "SIGTERM";
    case SIGINT: return "SIGINT";
    case SIGHUP: return "SIGHUP";
    default: return "a signal";
  }
}

extern "C" void on_stop_signal(int s) {
  if (noted_signal != 0) {
    // Asked twice: the default action, now.
    std::signal(s, SIG_DFL);
    std::raise(s);
    return;
  }
  noted_signal = s;
  ::alarm(kStopGraceSeconds);
}

}  // namespace

// ---------------------------------------------------------------- stop by signal

void install_stop_handlers() {
  struct sigaction action {};
  action.sa_handler = on_stop_signal;
  sigemptyset(&action.sa_mask);
  action.sa_flags = SA_RESTART;
  for (int s : {SIGTERM, SIGINT, SIGHUP}) ::sigaction(s, &action, nullptr);
}

void note_stop_signal(int signal) noexcept { noted_signal = signal; }

int stop_signal() noexcept { return noted_signal; }

void check_stop_signal() {
  const int s = noted_signal;
  if (s == 0 || stop_reported) return;
  stop_reported = true;
  const std::string& label = rs().label;
  const std::string what = std::string(signal_name(s)) + " received during " +
                           label.substr(std::min(label.find_first_not_of(' '), label.size()));
  TracePrintf("\n EXECUTION STOPPED: %s\n", what.c_str());
  LogPrintf("Job stopped: %s\n", what.c_str());
  fatal(ec::kInterrupted, {what});
}

// ---------------------------------------------------------------- dictionary

int fdfGetEnvVar(std::string& value, std::string_view name) {
  for (const auto& [k, v] : rs().dictionary)
    if (k == name) {
      value = v;
      return 0;
    }
  return -11;
}

void fdfSetEnvVar(std::string_view value, std::string_view name) {
  for (auto& [k, v] : rs().dictionary)
    if (k == name) {
      v = value;
      return;
    }
  rs().dictionary.emplace_back(std::string(name), std::string(value));
}

std::optional<std::string> env_lookup(std::string_view name) {
  std::string v;
  if (fdfGetEnvVar(v, name) != 0) {
    // Before the services are up the process environment is the only dictionary.
    if (!rs().up) {
      const std::string n(name);
      if (const char* e = process_env(n.c_str())) return with_separator(e);
    }
    return std::nullopt;
  }
  return v;
}

std::string env_required(std::string_view name) {
  auto v = env_lookup(name);
  if (!v) fatal(ec::kConfigMissing, {std::string(name)});
  return *v;
}

bool run_services_up() { return rs().up; }

std::string working_dir() {
  auto v = env_lookup("VANTERRA_WORKING_DIR");
  return v ? with_separator(*v) : std::string();
}

std::string directory_value(std::string_view name) {
  auto v = env_lookup(name);
  return v ? with_separator(*v) : std::string();
}

std::string working_file_path() { return rs().workingFile; }
std::string error_file_path() { return rs().workingFile + "_error"; }
std::string heartbeat_file_path() { return rs().workingFile + "_batch_ok"; }

// ---------------------------------------------------------------- catalogues

bool ErrorCatalogue::load(const std::string& path) {
  clear();
  if (!fs::is_regular_file(path)) return false;
  std::vector<std::string> lines;
  try {
    lines = ReadArgumentList(path, true);
  } catch (const CErrorExceptionManager&) {
    return false;
  }
  auto first_word = [](const std::string& s) {
    const auto b = s.find_first_not_of(" \n\t,");
    if (b == std::string::npos) return std::string();
    const auto e = s.find_first_of(" \n\t,", b);
    return s.substr(b, e == std::string::npos ? std::string::npos : e - b);
  };
  if (lines.empty()) return false;
  // The count comes from the file: compared with the lines there are before any arithmetic on it.
  const long n = std::strtol(lines[0].c_str(), nullptr, 10);
  if (n <= 0 || lines.size() < 3 || static_cast<unsigned long>(n) > (lines.size() - 3) / 2) return false;
  const auto count = static_cast<std::size_t>(n);
  std::vector<std::string> tokens;
  for (std::size_t i = 0; i < count; ++i) tokens.push_back(first_word(lines[2 + i]));
  for (std::size_t i = 0; i < count; ++i) primary_.push_back(lines[3 + count + i]);
  secondary_.resize(count);
  for (std::size_t g = 0; g < count; ++g) {
    const std::string key = "ErrorCodeInfo_" + tokens[g];
    for (std::size_t i = 3 + 2 * count; i + 1 < lines.size(); ++i) {
      if (first_word(lines[i]) != key) continue;
      const long m = std::strtol(lines[i + 1].c_str(), nullptr, 10);
      for (long j = 0; j < m && i + 2 + static_cast<std::size_t>(j) < lines.size(); ++j)
        secondary_[g].push_back(lines[i + 2 + static_cast<std::size_t>(j)].substr(0, 1025));
      break;
    }
  }
  return true;
}

void ErrorCatalogue::clear() {
  primary_.clear();
  secondary_.clear();
}

void ErrorCatalogue::texts(int32_t ec, std::string& primary, std::string& secondary) const {
  const int32_t pec = pec_of(ec);
  const int32_t sec = sec_of(ec);
  secondary.clear();
  if (pec < 0 || pec >= pec_count()) {
    primary = kGenericWrongCode;
    return;
  }
  primary = primary_[static_cast<std::size_t>(pec)];
  if (sec < 0) return;
  const auto& group = secondary_[static_cast<std::size_t>(pec)];
  if (static_cast<std::size_t>(sec) >= group.size()) {
    secondary = kGenericWrongCode;
    TracePrintf("EC %d PEC %d SEC %d\n", ec, pec, sec);
    return;
  }
  secondary = group[static_cast<std::size_t>(sec)];
}

void GetErrorTexts(int32_t ec, std::string& primary, std::string& secondary) {
  if (!rs().errorsLoaded) {
    primary = kInitError;
    secondary.clear();
    return;
  }
  rs().errors.texts(ec, primary, secondary);
}

void GetWarningTexts(int32_t ec, std::string& primary, std::string& secondary) {
  if (!rs().errorsLoaded) {
    primary = kInitError;
    secondary.clear();
    return;
  }
  rs().warnings.texts(ec, primary, secondary);
}

// ---------------------------------------------------------------- start and stop

void InitRunServices(int full, std::string_view versionText, int loadCatalogues) {
  RunState& s = rs();
  s.tracing = false;
  s.trace.reset();
  s.log.reset();
  s.version = std::string(versionText);
  std::srand(static_cast<unsigned>(std::time(nullptr)));
  s.errors.clear();
  s.warnings.clear();
  s.errorsLoaded = false;
  s.warningRaised = false;
  s.label = "-";
  s.lastPercent = 0;
  s.dictionary.clear();
  s.up = true;
  provisional_working_file();

  const char* initDir = process_env("VANTERRA_INIT_DIR");
  if (!initDir) fatal(ec::kConfigMissing, {"VANTERRA_INIT_DIR"});
  const std::string configPath = with_separator(initDir) + std::string(kConfigurationFile);
  std::ifstream config(configPath, std::ios::binary);
  if (!config) fatal(ec::kFileNotFound, {configPath});

  for (int i = 0; i < 14; ++i) {
    std::string line;
    if (!std::getline(config, line)) {
      fatal(ec::kConfigMissing, {std::string(kConfigNames[i].empty() ? "configuration line 13" : kConfigNames[i])});
    }
    // The line end goes; a CR of a file written on another system goes with it.
    if (!line.empty() && line.back() == '\r') line.pop_back();
    if (line.size() > 511) line.resize(511);
    if (!kConfigNames[i].empty()) fdfSetEnvVar(line, kConfigNames[i]);
  }

  // Environment overrides.
  std::string workingDir;
  fdfGetEnvVar(workingDir, "VANTERRA_WORKING_DIR");
  if (const char* w = process_env("VANTERRA_WORKING_DIR")) workingDir = w;
  if (workingDir.empty()) fatal(ec::kConfigMissing, {"VANTERRA_WORKING_DIR"});
  fdfSetEnvVar(with_separator(workingDir), "VANTERRA_WORKING_DIR");
  if (const char* g = process_env("VANTERRA_GCP_DATABASE_DIR")) fdfSetEnvVar(g, "VANTERRA_GCP_DATABASE_DIR");
  if (const char* t = process_env("VANTERRA_TRACING")) fdfSetEnvVar(t, "VANTERRA_TRACING");
  for (std::string_view dirKey : {"VANTERRA_KEY_FILES_DIR", "VANTERRA_MANDATORY_DIR", "VANTERRA_EXE_DIR",
                                  "VANTERRA_MAP_FILES_DIR", "VANTERRA_CEOS_DES_FILES_DIR", "VANTERRA_GCP_DATABASE_DIR",
                                  "VANTERRA_OMBRIX_DES_FILES_DIR", "VANTERRA_OTHER_01_DES_FILES_DIR",
                                  "VANTERRA_XML_SCHEMA_DES_FILES_DIR"}) {
    std::string v;
    if (fdfGetEnvVar(v, dirKey) == 0 && !v.empty()) fdfSetEnvVar(with_separator(v), dirKey);
  }

  std::string batchDir = working_dir();
  if (const char* b = process_env("VANTERRA_BATCH_DIR")) batchDir = with_separator(b);
  fdfSetEnvVar(batchDir, "VANTERRA_BATCH_DIR");
  const char* wfName = process_env("VANTERRA_WORKING_FILE");
  s.workingFile = batchDir + (wfName ? wfName : std::string(kDefaultWorkingFile));

  std::string dummy;
  fdfGetEnvVar(dummy, "VANTERRA_DUMMY_VALUE");
  if (dummy.find_first_not_of(' ') == std::string::npos) fatal(ec::kConfigMissing, {"VANTERRA_DUMMY_VALUE"});
  if (dummy.find("NaN") != std::string::npos) {
    s.dummyFloat = std::numeric_limits<float>::quiet_NaN();
    s.dummyDouble = std::numeric_limits<double>::quiet_NaN();
  } else {
    std::istringstream in(dummy);
    in.imbue(std::locale::classic());
    in >> s.dummyDouble;
    s.dummyFloat = static_cast<float>(s.dummyDouble);
  }

  if (const char* lvl = process_env("VANTERRA_TRACE_LEVEL")) s.traceLevel = std::atoi(lvl);
  else s.traceLevel = kTraceThreshold;

  if (!full) return;
  const std::string desDir = directory_value("VANTERRA_CEOS_DES_FILES_DIR");
  s.geoidPath = desDir + "WW15MGH.GRD";
  if (loadCatalogues) {
    s.errors.load(desDir + std::string(kErrorsCatalogue));
    s.warnings.load(desDir + std::string(kWarningsCatalogue));
    s.errorsLoaded = true;
  }
  s.log.reset(std::fopen((working_dir() + std::string(kLogFile)).c_str(), "a"));
  std::string tracing;
  fdfGetEnvVar(tracing, "VANTERRA_TRACING");
  if (tracing == "ACTIVE") {
    s.trace.reset(std::fopen((working_dir() + std::string(kTraceFile)).c_str(), "w"));
    s.tracing = static_cast<bool>(s.trace);
    if (s.tracing) TracePrintf("OpenTrace 1  2\n");
  }
}

void CloseRunServices() {
  RunState& s = rs();
  close_log();
  close_trace();
  s.tracing = false;
  s.dictionary.clear();
  s.up = false;
}

// ---------------------------------------------------------------- log and trace

bool LogPrintf(const char* format, ...) {
  RunState& s = rs();
  if (!s.log) return false;
  va_list args;
  va_start(args, format);
  const std::string text = vformat(format, args);
  va_end(args);
  std::fputs(text.c_str(), s.log.get());
  std::fflush(s.log.get());
  return std::ferror(s.log.get()) == 0;
}

bool tracing_on() { return rs().tracing && rs().traceLevel >= kTraceThreshold; }

bool TracePrintf(const char* format, ...) {
  if (!tracing_on()) return false;
  RunState& s = rs();
  va_list args;
  va_start(args, format);
  const std::string text = vformat(format, args);
  va_end(args);
  std::fputs(text.c_str(), s.trace.get());
  return std::ferror(s.trace.get()) == 0;
}

void flush_trace() {
  if (tracing_on()) std::fflush(rs().trace.get());
}

void SetActivityLabel(std::string_view text) {
  // A stage boundary is a place to stop too: the record then names the stage that was cut short.
  check_stop_signal();
  std::string label = " " + std::string(text);
  for (char& c : label)
    if (c == '\n') c = ' ';
  if (label.size() > kLabelMax) label.resize(kLabelMax);
  rs().label = std::move(label);
}

const std::string& activity_label() { return rs().label; }
const std::string& version_text() { return rs().version; }

std::string local_time_text() {
  const std::time_t now = std::time(nullptr);
  char buf[64];
  std::tm tm{};
  localtime_r(&now, &tm);
  std::strftime(buf, sizeof buf, "%a %b %d %H:%M:%S %Y\n", &tm);
  return buf;
}

void PrintStartBanner(std::span<const std::string> arguments, std::string_view title, const std::string* text) {
  SetActivityLabel(title);
  std::string banner = "\n\n\n" + stars();
  char head[1024];
  std::snprintf(head, sizeof head, "\nSTART : %s  [ %s ]\n%s", std::string(title).c_str(), rs().version.c_str(),
                local_time_text().c_str());
  banner += head + stars() + "\n\n";
  if (text) {
    banner += *text;
  } else {
    for (std::size_t i = 0; i < arguments.size(); ++i) {
      char line[1024];
      std::snprintf(line, sizeof line, " Parameter %d (%s)\n", static_cast<int>(i), arguments[i].c_str());
      banner += line;
    }
  }
  banner += "\n" + stars() + "\n\n";
  LogPrintf("%s", banner.c_str());
  TracePrintf("%s", banner.c_str());
  flush_trace();
}

void PrintEndBanner() {
  char head[1024];
  std::snprintf(head, sizeof head, "\nEND : %s  -  %s", rs().version.c_str(), local_time_text().c_str());
  const std::string banner = "\n\n\n" + stars() + head + stars() + "\n\n";
  LogPrintf("%s", banner.c_str());
  TracePrintf("%s", banner.c_str());
  flush_trace();
}

// ---------------------------------------------------------------- host files

void WriteErrorRecord(int32_t ec, std::span<const std::string> details) {
  const std::vector<std::string> record = record_lines(ec, details);
  std::vector<std::string> errorFile{"-1"};
  errorFile.insert(errorFile.end(), record.begin(), record.end());
  write_lines(error_file_path(), errorFile);

  const std::string wf = working_file_path();
  std::vector<std::string> working{ec == ec::kWarnings ? "-2" : "-1"};
  bool opened = false;
  if (fs::exists(wf)) {
    for (int attempt = 0; attempt < 10 && !opened; ++attempt) {
      sleep_seconds(attempt);
      std::ifstream probe(wf);
      if (!probe) continue;
      const auto old = read_lines(wf);
      working.push_back(old.size() > 1 ? old[1] : std::string());
      working.insert(working.end(), record.begin(), record.end());
      opened = write_lines(wf, working);
    }
  }
  if (!opened) {
    if (working.size() == 1) {
      working.push_back(rs().label);
      working.insert(working.end(), record.begin(), record.end());
    }
    write_lines(wf + "_tmp", working);
  }
}

bool getAndSetPerc(int oldValue, int newValue, const std::string* label) {
  check_stop_signal();
  if (oldValue == newValue) return true;
  // Without run services there is no host to tell, and no working file to stop the run by:
  // the stages are being used as a library.
  if (!rs().up) return true;
  // The heartbeat is usually absent already: that is not an error of the stage being reported
  // on, whose frames test errno.
  {
    const ErrnoGuard keep;
    std::error_code ec;
    fs::remove(heartbeat_file_path(), ec);
  }
  const std::string wf = working_file_path();
  if (!fs::exists(wf)) {
    TracePrintf("getAndSetPerc - Not found the file : %s\n", wf.c_str());
    interrupted();
  }
  std::fstream file;
  for (int attempt = 1; attempt <= 5; ++attempt) {
    file.open(wf, std::ios::in | std::ios::out);
    if (file.is_open()) break;
    std::string state = " RDSTATE = ";
    if (file.eof()) state += "End of file reached ";
    if (file.fail()) state += "| A possibly recoverable formatting or conversion error ";
    if (file.bad()) state += "| A severe I/O error or unknown state";
    TracePrintf("%s File %s attempt open : %d\n", state.c_str(), wf.c_str(), attempt);
    file.clear();
    if (attempt == 5) return true;
    sleep_seconds(attempt);
  }
  std::string first, stored;
  std::getline(file, first);
  std::getline(file, stored);
  if (first.size() > 1026) first.resize(1026);
  if (stored.size() > 1026) stored.resize(1026);
  if (!stored.empty() && stored.back() == '\r') stored.pop_back();
  file.close();
  const long value = std::strtol(first.c_str(), nullptr, 0);
  if (value > 100) interrupted();

  std::ofstream out(wf, std::ios::trunc);
  out << newValue << '\n' << (label ? *label : stored) << '\n';
  return true;
}

int waitbar_open(std::string_view text) {
  SetActivityLabel(text);
  // The host shows the label from the working file, so the new activity is written at once.
  const std::string label(text);
  getAndSetPerc(-1, 0, &label);
  rs().lastPercent = 0;
  return 0;
}

int waitbar_update(double percent) {
  if (percent > 100.0) percent = 100.0;
  const int n = static_cast<int>(percent);
  if (n != rs().lastPercent) {
    getAndSetPerc(rs().lastPercent, n, nullptr);
    rs().lastPercent = n;
  }
  return 0;
}

void raise_warning(int32_t ec, std::string_view detail, std::string_view sourceFile, int line) {
  std::string primary, secondary;
  GetWarningTexts(ec, primary, secondary);
  const std::string d(detail), f(sourceFile);
  TracePrintf("\nWARNING : %s [%s] (%s) \n %s   %s\n    FILE=%s   LINE=%d  (errno = %d)", primary.c_str(),
              secondary.c_str(), d.c_str(), rs().label.c_str(), rs().version.c_str(), f.c_str(), line, errno);
  LogPrintf("\nWARNING : [ERROR ID : %d]%s [%s] (%s) \n %s   %s\n    FILE=%s   LINE=%d  (errno = %d)", ec,
            primary.c_str(), secondary.c_str(), d.c_str(), rs().label.c_str(), rs().version.c_str(), f.c_str(),
            line, errno);
  rs().warningRaised = true;
}

bool warning_raised() { return rs().warningRaised; }

bool FileExists(const std::string& path) {
  if (path.empty() || path.find("NotOK") != std::string::npos) return false;
  struct stat st {};
  return ::stat(path.c_str(), &st) == 0;
}

bool DeleteFileForced(const std::string& path) {
  std::error_code ec;
  fs::permissions(path, fs::perms::owner_write, fs::perm_options::add, ec);
  return fs::remove(path, ec);
}

void DeleteProductFile(const std::string& path, bool withCompanions) {
  DeleteFileForced(path);
  if (!withCompanions) return;
  // The footprint step also writes a KML and the shapefile's projection: they go with the rest.
  for (const char* ext :
       {"_hdr", ".hdr", ".sml", ".shx", ".shp", ".shp_hdr", ".shp.hdr", ".dbf", ".xml", ".kml", ".prj"})
    DeleteFileForced(path + ext);
}

// ---------------------------------------------------------------- the ends of a run

int RunFatalSequence(const CErrorExceptionManager& error) {
  const int status = process_status_for(error.ec());
  std::string primary, secondary;
  GetErrorTexts(error.ec(), primary, secondary);
  if (!rs().up) return status;
  WriteErrorRecord(error.ec(), error.details());
  TracePrintf("\nERROR : %s [%s] (%s) \n %s   %s\n    FILE=%s   LINE=%d  (errno = %d)", primary.c_str(),
              secondary.c_str(), error.detail().c_str(), error.job_label().c_str(), rs().version.c_str(),
              error.source_file().c_str(), error.line(), error.saved_errno());
  LogPrintf("\n\n%s [ERROR ID : %d]\n  %s [%s]\n  %s \n\n", rs().version.c_str(), error.ec(), primary.c_str(),
            secondary.c_str(), error.detail().c_str());
  PrintEndBanner();
  CloseRunServices();
  return status;
}

int FinishRun(int32_t ec, int endStatus, int printReport) {
  RunState& s = rs();
  if (printReport) {
    if (endStatus != 0 && ec != 0) {
      std::string primary, secondary;
      GetErrorTexts(ec, primary, secondary);
      LogPrintf("\n\n-%s   %s\n\n%s\n\nERROR :\n  %s\n\n", s.label.c_str(), s.version.c_str(),
                local_time_text().c_str(), primary.c_str());
    } else if (ec == 0) {
      LogPrintf("\n\nSUCCESSFUL\n\n%s\n\n", local_time_text().c_str());
    }
    PrintEndBanner();
    close_log();
    close_trace();
  }
  const std::string wf = working_file_path();
  const bool warned = s.warningRaised;
  if (ec == 0) {
    if (warned) {
      WriteErrorRecord(ec::kWarnings, std::vector<std::string>{""});
    } else {
      for (int i = 0; i < 30 && fs::exists(wf); ++i) {
        DeleteFileForced(wf);
        if (fs::exists(wf)) sleep_seconds(static_cast<int>(i * 0.1));
      }
    }
  }
  CloseRunServices();
  if (warned && ec == 0) return process_status_for(ec::kWarnings);
  return process_status_for(ec);
}

}  // namespace sar::base

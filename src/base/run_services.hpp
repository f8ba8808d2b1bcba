#pragma once
// Run services: everything the engine says to its host goes through files.
//
//  - Vanterra_configuration.ini (14 positional lines) in VANTERRA_INIT_DIR, with environment
//    overrides, fills a dictionary of directories and switches;
//  - Vanterra.log (appended) and Vanterra.trace (when tracing is "ACTIVE") in the working dir;
//  - the working file (percentage and activity label), its "_error", "_batch_ok" and "_tmp"
//    companions; the host stops a run by deleting the working file or writing a value above 100;
//  - the error and warning catalogues, which give the texts of an error code.
//
// The state is process-wide: one process runs one job.
#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <vector>

#include "base/errors.hpp"

namespace sar::base {

inline constexpr std::string_view kVersionText = "VanterraFocRadarsatASARPalsar ENVI 3.0.000.003 Aug 27 2007 ";
inline constexpr std::string_view kConfigurationFile = "Vanterra_configuration.ini";
inline constexpr std::string_view kLogFile = "Vanterra.log";
inline constexpr std::string_view kTraceFile = "Vanterra.trace";
inline constexpr std::string_view kTraceSaveFile = "Vanterra.trace_save";
inline constexpr std::string_view kDefaultWorkingFile = "Vanterra.working";
inline constexpr std::string_view kErrorsCatalogue = "vtr_errors_catalog.des";
inline constexpr std::string_view kWarningsCatalogue = "vtr_warnings_catalog.des";
inline constexpr std::string_view kUnitRunServices = "vtr_errors";
/// Trace level from which trace lines are written.
inline constexpr int kTraceThreshold = 10;
/// Separator of composed paths on this platform.
inline constexpr char kPathSeparator = '/';

// Dictionary of run values (configuration lines and environment overrides).
int fdfGetEnvVar(std::string& value, std::string_view name);  // 0, or -11 when absent
void fdfSetEnvVar(std::string_view value, std::string_view name);
/// Value of a dictionary entry, or nullopt.
std::optional<std::string> env_lookup(std::string_view name);
/// Value of a dictionary entry; a missing one raises 783360 with the name as detail.
std::string env_required(std::string_view name);
bool run_services_up();

/// The catalogue of error (or warning) texts by code.
class ErrorCatalogue {
 public:
  /// Load from a catalogue file; false (and an empty catalogue) when it cannot be read.
  bool load(const std::string& path);
  void clear();
  int pec_count() const { return static_cast<int>(primary_.size()); }
  /// Primary and secondary text of `ec`; "GENERIC ERROR WRONG CODE" for codes beyond the table.
  void texts(int32_t ec, std::string& primary, std::string& secondary) const;

 private:
  std::vector<std::string> primary_;
  std::vector<std::vector<std::string>> secondary_;
};

/// Start the services: configuration, dictionary, and with `full` the catalogues, log, trace.
/// Raises 783360 or 261122 as the host expects when the configuration is missing or short.
void InitRunServices(int full, std::string_view versionText, int loadCatalogues);
/// Close log and trace, save the trace, drop the dictionary: the state of a process that ended.
void CloseRunServices();

bool LogPrintf(const char* format, ...) __attribute__((format(printf, 1, 2)));
bool TracePrintf(const char* format, ...) __attribute__((format(printf, 1, 2)));
/// Tracing is on at level 10 or above.
bool tracing_on();
void flush_trace();

void SetActivityLabel(std::string_view text);
const std::string& activity_label();
const std::string& version_text();

void GetErrorTexts(int32_t ec, std::string& primary, std::string& secondary);
void GetWarningTexts(int32_t ec, std::string& primary, std::string& secondary);

void PrintStartBanner(std::span<const std::string> arguments, std::string_view title, const std::string* text);
void PrintEndBanner();

/// Error file, then the working file (or its "_tmp" companion) get the record of `ec`.
void WriteErrorRecord(int32_t ec, std::span<const std::string> details);

/// A stop asked for by a signal (SIGTERM, SIGINT, SIGHUP). The handler only notes the signal;
/// the job stops at its next progress report or activity change with the interruption code,
/// the signal and the activity named in the error record, and its partial files go with the
/// unwinding. A second signal, or a job that reaches no such point within the grace time, ends
/// the process at once.
inline constexpr unsigned kStopGraceSeconds = 20;
void install_stop_handlers();
/// What the handler calls: async-signal-safe.
void note_stop_signal(int signal) noexcept;
/// The signal noted, 0 when none.
int stop_signal() noexcept;
/// Raises the interruption when a signal has been noted and not yet reported; else returns.
void check_stop_signal();

/// Progress to the working file. Returns true when the job may go on; raises 326400 when the
/// host has stopped the run. `label` null keeps the stored label.
bool getAndSetPerc(int oldValue, int newValue, const std::string* label);
int waitbar_open(std::string_view text);
int waitbar_update(double percent);

/// A warning: trace and log lines from the warnings catalogue; the run ends with 65280.
void raise_warning(int32_t ec, std::string_view detail, std::string_view sourceFile, int line);
bool warning_raised();

bool FileExists(const std::string& path);
bool DeleteFileForced(const std::string& path);
void DeleteProductFile(const std::string& path, bool withCompanions);

/// The fatal exit sequence for a raised error; returns the process exit status.
int RunFatalSequence(const CErrorExceptionManager& error);
/// The normal end; returns the process exit status (0 for success and success with warnings,
/// the primary code otherwise).
int FinishRun(int32_t ec, int endStatus, int printReport);

/// Paths of the host files of this run (valid once the services are up).
std::string working_file_path();
std::string error_file_path();
std::string heartbeat_file_path();
std::string working_dir();
/// Directory value from the dictionary, ending in the path separator.
std::string directory_value(std::string_view name);

/// Local time text used in banners and reports.
std::string local_time_text();

}  // namespace sar::base

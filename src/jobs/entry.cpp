#include "jobs/entry.hpp"

#include <array>
#include <cerrno>
#include <cstdio>

#include "base/arguments.hpp"
#include "base/diagnostics.hpp"
#include "base/errors.hpp"
#include "base/run_services.hpp"
#include "dsp/fft.hpp"
#include "io/cell_types.hpp"
#include "jobs/drivers.hpp"

namespace sar::jobs {
namespace {

constexpr std::array<ModePrefix, 5> kModes = {{
    {"main_focussing_asar_AP#", 2, &main_focussing_asar_ap, "main_focussing_asar_ap"},
    {"main_focussing_asar_IM#", 1, &main_focussing_asar_im, "main_focussing_asar_im"},
    {"main_focussing_asar_WS#", 3, &main_focussing_asar_ws_v2, "main_focussing_asar_ws_v2"},
    {"main_focussing_asar_RS#", 4, &main_focussing_asar_rs, "main_focussing_asar_rs"},
    {"main_multilook_WSS#", 5, &main_multilook_wss, "main_multilook_wss"},
}};

constexpr int kLineStatus = 130;
constexpr int kLineCatchAll = 139;

// The host reads the files; a person at a terminal reads this line.
void say_failure(const base::CErrorExceptionManager& e) {
  std::string primary, secondary;
  base::GetErrorTexts(e.ec(), primary, secondary);
  std::fprintf(stderr, "focussing: error %d: %s%s%s%s%s\n", e.ec(), primary.c_str(), secondary.empty() ? "" : " [",
               secondary.c_str(), secondary.empty() ? "" : "]",
               e.detail().empty() ? "" : (" (" + e.detail() + ")").c_str());
}

int fatal_exit(const base::CErrorExceptionManager& e) {
  say_failure(e);
  return base::RunFatalSequence(e);
}

}  // namespace

std::span<const ModePrefix> mode_prefixes() { return kModes; }

int match_mode(std::string_view command) {
  for (std::size_t i = 0; i < kModes.size(); ++i)
    if (command.substr(0, kModes[i].prefix.size()) == kModes[i].prefix) return static_cast<int>(i);
  return -1;
}

int focussing_entry(std::string command) {
  errno = 0;
  try {
    base::InitRunServices(1, base::kVersionText, 1);
  } catch (const base::CErrorExceptionManager& e) {
    return fatal_exit(e);
  } catch (const base::ProcessExit& e) {
    return e.status;
  }

  // Rasters are written in the byte order the configuration asks for.
  io::set_raster_settings({io::byte_order_from_name(base::env_lookup("VANTERRA_DEFAULT_BYTE_ORDER").value_or(""))});

  // A rerun of a job must give the same bytes: transform plans are chosen by estimate, not by
  // timing candidates, whose choice (and rounding) can change from run to run.
  dsp::set_fft_planning(dsp::FftPlanning::Estimate);

  command = base::cut_at_host_separator(command);
  if (base::init_ckerr_locking() != 0) {
    std::fprintf(stderr, "focussing: the diagnostics layer did not start\n");
    return 1;
  }
  base::init_report(0, "ASAR FOCUSSING", 1);

  int status = 0;
  try {
    const int mode = match_mode(command);
    if (mode >= 0) {
      const ModePrefix& m = kModes[static_cast<std::size_t>(mode)];
      status = m.driver(command.substr(m.prefix.size()));
    } else {
      status = base::ec::kNoModePrefix;
      if (base::tracing_on()) base::TracePrintf("[%s]\n", command.c_str());
    }
    if (base::tracing_on()) {
      base::TracePrintf("%s", base::working_file_path().c_str());
      base::flush_trace();
    }
    if (status == 0) {
      base::exit_report();
      base::exit_ckerr();
      return base::FinishRun(0, 1, 1);
    }
    return fatal_exit(base::CErrorExceptionManager(status, {command}, std::string(kUnitEntry), kLineStatus));
  } catch (const base::CErrorExceptionManager& e) {
    return fatal_exit(e);
  } catch (const base::ProcessExit& e) {
    return e.status;
  } catch (...) {
    const std::string label = base::activity_label();
    return fatal_exit(base::CErrorExceptionManager(base::ec::kUncaught, {label}, std::string(kUnitEntry),
                                                   kLineCatchAll));
  }
}

}  // namespace sar::jobs

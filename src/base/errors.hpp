#pragma once
// Failure types of the engine and the error-code arithmetic shared with the host.
//
// A job ends in one of three ways besides success:
//  - a FatalError (the host-visible error record with EC, texts and detail), raised anywhere
//    and turned into the fatal exit sequence by the entry alone;
//  - a ProcessExit (end now with a status and nothing written), used by the checked profile
//    reads and the byte-order selector, which end the run without any report;
//  - anything else thrown, which the entry's catch-all reports as an uncaught failure.
#include <cstdint>
#include "base/source_location.hpp"
#include <limits>
#include <stdexcept>
#include <string>
#include <vector>

namespace sar::base {

/// Error code arithmetic: EC = PEC * 65280 + SEC + 1.
constexpr int32_t kEcFactor = 65280;
constexpr int32_t make_ec(int32_t pec, int32_t sec) { return pec * kEcFactor + sec + 1; }
constexpr int32_t pec_of(int32_t ec) { return ec / kEcFactor; }
constexpr int32_t sec_of(int32_t ec) { return ec % kEcFactor - 1; }

/// The codes raised by the job layer and the run services.
namespace ec {
constexpr int32_t kSuccess = 0;
constexpr int32_t kWarnings = 65280;            // 1, -1
constexpr int32_t kStageFailed = 130560;        // 2, -1
constexpr int32_t kFileNotFound = 261122;       // 4, 1
constexpr int32_t kInterrupted = 326400;        // 5, -1
constexpr int32_t kBadArguments = 456962;       // 7, 1
constexpr int32_t kNoModePrefix = 456963;       // 7, 2
constexpr int32_t kConfigMissing = 783360;      // 12, -1
constexpr int32_t kUncaught = 913920;           // 14, -1
constexpr int32_t kXcaMissing = 1305601;        // 20, 0
constexpr int32_t kDorvorMissing = 1305602;     // 20, 1
constexpr int32_t kInsMissing = 1305603;        // 20, 2
constexpr int32_t kXchMissing = 1305604;        // 20, 3
constexpr int32_t kImageMissing = 1305605;      // 20, 4
constexpr int32_t kFileIo = 1305606;            // 20, 5
constexpr int32_t kBurstSync = 1370881;         // 21, 0
constexpr int32_t kDemNotCovering = 1370882;    // 21, 1
constexpr int32_t kDemMissing = 1370883;        // 21, 2
constexpr int32_t kOverlap = 1370884;           // 21, 3
}  // namespace ec

/// Exit status of the process for an error code. Linux keeps only the low byte of a status,
/// and every whole-group code (SEC -1) has a low byte of 0, so the status is the primary code:
/// 0 for success and success-with-warnings, the PEC (1..255) for any other code.
int process_status_for(int32_t ec);

/// The one host-visible failure: it carries what the error record and the log show.
/// Thrown by value; only the entry catches it and runs the fatal exit sequence.
class CErrorExceptionManager {
 public:
  CErrorExceptionManager(int32_t ec, std::vector<std::string> details, std::string sourceFile, int line);

  int32_t ec() const { return ec_; }
  int32_t pec() const { return pec_of(ec_); }
  int32_t sec() const { return sec_of(ec_); }
  const std::vector<std::string>& details() const { return details_; }
  /// First detail or the empty string.
  const std::string& detail() const;
  const std::string& source_file() const { return sourceFile_; }
  int line() const { return line_; }
  /// Activity label and errno in force when the failure was raised.
  const std::string& job_label() const { return jobLabel_; }
  int saved_errno() const { return savedErrno_; }

 private:
  int32_t ec_;
  std::vector<std::string> details_;
  std::string sourceFile_;
  int line_;
  std::string jobLabel_;
  int savedErrno_;
};

using FatalError = CErrorExceptionManager;

/// End the process with `status`, writing nothing more.
struct ProcessExit {
  int status;
};

/// What is wrong with an input file, as a reader sees it.
enum class InputFault {
  kMissing,      // absent or unreadable
  kWrongType,    // another product than the one asked for
  kTruncated,    // shorter than its headers say
  kMalformed,    // a field that does not read as what it must be
  kNotCovering,  // valid, but it does not reach over the scene
  kContradicts,  // two parts of the file disagree
};

/// The one failure type of the readers of untrusted files: what is wrong, the file, the byte
/// offset and the field where it was seen, and the host code and record details the reader
/// proposes. It is a host-visible failure as it stands (so a driver that does not look at it
/// reports what the reader said), and a standard exception; the job driver, which knows what
/// the file was for, may catch it and choose another code (an orbit that does not cover the
/// scene is a stage that cannot run, say).
class InputError : public CErrorExceptionManager, public std::runtime_error {
 public:
  /// `what`: the message of the standard exception; empty: the details joined. `file`: the file
  /// at fault; empty: the first detail.
  InputError(InputFault fault, int32_t hostCode, std::vector<std::string> details, int64_t offset = -1,
             std::string field = {}, const std::string& what = {}, std::string file = {},
             source_location loc = source_location::current());
  InputFault fault() const { return fault_; }
  int32_t host_code() const { return ec(); }
  const std::string& file() const { return file_; }
  /// Byte offset of the faulty field in the file, -1 when not tied to a place.
  int64_t offset() const { return offset_; }
  const std::string& field() const { return field_; }
  /// For kNotCovering: the span (sec85) the file does cover; NaN otherwise.
  double span_start() const { return spanStart_; }
  double span_stop() const { return spanStop_; }
  void set_span(double start, double stop) {
    spanStart_ = start;
    spanStop_ = stop;
  }

 private:
  InputFault fault_;
  std::string file_;
  int64_t offset_;
  std::string field_;
  double spanStart_ = std::numeric_limits<double>::quiet_NaN();
  double spanStop_ = std::numeric_limits<double>::quiet_NaN();
};

/// Raise an input error: the reader's fault, proposed code and details (the file first, unless
/// `file` names it).
[[noreturn]] void input_fault(InputFault fault, int32_t ec, std::vector<std::string> details, int64_t offset = -1,
                              std::string field = {}, std::string file = {},
                              source_location loc = source_location::current());

/// Raise the fatal exit for `ec` with up to three detail strings. The source location names
/// the unit in the trace; pass a unit name explicitly where the host expects a fixed one.
[[noreturn]] void fatal(int32_t ec, std::vector<std::string> details = {},
                        source_location loc = source_location::current());
[[noreturn]] void fatal_at(int32_t ec, std::vector<std::string> details, std::string sourceFile, int line);

}  // namespace sar::base

#include "base/errors.hpp"

#include <cerrno>

#include "base/run_services.hpp"

namespace sar::base {

int process_status_for(int32_t ecode) {
  if (ecode == ec::kSuccess || ecode == ec::kWarnings) return 0;
  const int32_t pec = pec_of(ecode);
  if (pec >= 1 && pec <= 255) return pec;
  // Codes outside the primary table still must not read as success.
  return ecode == 0 ? 0 : 1;
}

CErrorExceptionManager::CErrorExceptionManager(int32_t code, std::vector<std::string> details, std::string sourceFile,
                                               int line)
    : ec_(code),
      details_(std::move(details)),
      sourceFile_(std::move(sourceFile)),
      line_(line),
      jobLabel_(activity_label()),
      savedErrno_(errno) {}

const std::string& CErrorExceptionManager::detail() const {
  static const std::string empty;
  return details_.empty() ? empty : details_.front();
}

namespace {
std::string joined(const std::vector<std::string>& details) {
  std::string text;
  for (const std::string& d : details) text += (text.empty() ? "" : ": ") + d;
  return text;
}
}  // namespace

InputError::InputError(InputFault fault, int32_t hostCode, std::vector<std::string> details, int64_t offset,
                       std::string field, const std::string& what, std::string file, source_location loc)
    : CErrorExceptionManager(hostCode, details, loc.file_name(), static_cast<int>(loc.line())),
      std::runtime_error(what.empty() ? joined(details) : what),
      fault_(fault),
      file_(file.empty() && !details.empty() ? details.front() : std::move(file)),
      offset_(offset),
      field_(std::move(field)) {}

void input_fault(InputFault fault, int32_t code, std::vector<std::string> details, int64_t offset, std::string field,
                 std::string file, source_location loc) {
  throw InputError(fault, code, std::move(details), offset, std::move(field), {}, std::move(file), loc);
}

void fatal(int32_t code, std::vector<std::string> details, source_location loc) {
  throw CErrorExceptionManager(code, std::move(details), loc.file_name(), static_cast<int>(loc.line()));
}

void fatal_at(int32_t code, std::vector<std::string> details, std::string sourceFile, int line) {
  throw CErrorExceptionManager(code, std::move(details), std::move(sourceFile), line);
}

}  // namespace sar::base

// Argument list files, as the entry reads a job's list.
#include "base/arguments.hpp"
#include "base/errors.hpp"
#include "fuzz_support.hpp"

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  const std::string path = sar::fuzz::input_file(data, size, "job.lst");
  try {
    (void)sar::base::ReadArgumentList(path, false);
    (void)sar::base::GetJobArguments(path + std::string(sar::base::kHostSeparator) + "host text");
  } catch (const sar::base::CErrorExceptionManager&) {
  }
  (void)sar::base::cut_at_host_separator(sar::fuzz::as_text(data, size));
  return 0;
}

// The host's configuration file and the error catalogues: the same bytes go to both readers.
#include <cstdlib>

#include "base/errors.hpp"
#include "base/run_services.hpp"
#include "fuzz_support.hpp"

using namespace sar::base;

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  static const bool environment = [] {
    ::setenv("VANTERRA_INIT_DIR", sar::fuzz::scratch_dir().c_str(), 1);
    ::unsetenv("VANTERRA_WORKING_DIR");
    ::unsetenv("VANTERRA_BATCH_DIR");
    return true;
  }();
  (void)environment;
  const std::string path = sar::fuzz::input_file(data, size, std::string(kConfigurationFile));
  try {
    InitRunServices(0, kVersionText, 0);
    (void)env_lookup("VANTERRA_WORKING_DIR");
    (void)directory_value("VANTERRA_CEOS_DES_FILES_DIR");
  } catch (const CErrorExceptionManager&) {
  }
  CloseRunServices();

  ErrorCatalogue catalogue;
  if (catalogue.load(path)) {
    std::string primary, secondary;
    for (int32_t ec : {0, 1, 65280, 65281, 130560, 261122, 783360, 2000000000})
      catalogue.texts(ec, primary, secondary);
  }
  return 0;
}

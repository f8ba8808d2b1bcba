// Level 0 product headers: the MPH and SPH fields read by position, and the product typing.
#include "base/errors.hpp"
#include "envisat/level0_format.hpp"
#include "envisat/product_types.hpp"
#include "fuzz_support.hpp"

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  const std::string path = sar::fuzz::input_file(data, size, "ASA_IM__0P.N1");
  const sar::envisat::EnvisatTypes types(path);
  (void)types.find_type();
  (void)types.product_name();
  try {
    const auto header = sar::envisat::read_level0_header(path);
    (void)sar::envisat::mode_info(header.mode);
  } catch (const sar::base::CErrorExceptionManager&) {
  }
  return 0;
}

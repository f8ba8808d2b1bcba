// Orbit products; SAR_FUZZ_ORBIT picks the family: 1 the ENVISAT-format DORIS and FOS files
// (parsed in memory and, for the family detection, from a file), 2 the RADARSAT text orbit.
#include "fuzz_support.hpp"
#include "geometry/orbit_file.hpp"

using namespace sar::geometry;

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  const auto text = sar::fuzz::as_text(data, size);
  try {
#if SAR_FUZZ_ORBIT == 1
    (void)parse_envisat_orbit(text, "fuzz");
#else
    (void)parse_text_orbit(text, "fuzz");
#endif
  } catch (const OrbitError&) {
  }
  try {
    (void)read_orbit(sar::fuzz::input_file(data, size, "orbit"));
  } catch (const OrbitError&) {
  }
  return 0;
}

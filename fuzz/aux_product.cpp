// ASA_INS, ASA_XCA and ASA_XCH readers; SAR_FUZZ_AUX picks the product (1, 2, 3).
#include "base/errors.hpp"
#include "envisat/aux_products.hpp"
#include "envisat/fbaq.hpp"
#include "fuzz_support.hpp"

using namespace sar::envisat;

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  const std::string path = sar::fuzz::input_file(data, size, "ASA_AUX_AX");
  try {
#if SAR_FUZZ_AUX == 1
    const InsRecord ins = InsRecord::read(path);
    (void)ins.validity_start();
    (void)ins.validity_stop();
    (void)ins.lut_i();
    (void)ins.lut_q();
    for (int beam = 1; beam <= 7; ++beam) {
      (void)ins.parameters(Timeline::kIm, beam);
      (void)ins.parameters(Timeline::kAp, beam);
      (void)ins.pattern_reference_angle(beam);
    }
    for (int beam = 15; beam <= 19; ++beam) (void)ins.parameters(Timeline::kWs, beam);
    for (int row = 0; row < 7; ++row) (void)ins.row_coefficients(row, row % 2);
    for (int swath = 0; swath < 5; ++swath) (void)ins.ws_row_coefficients(swath, swath % 2);
    (void)ins.gain_temperature();
    (void)ins.gain_coefficients();
    std::vector<float> gains(kGainTableLength);
    read_gain_table(path, gains);
#elif SAR_FUZZ_AUX == 2
    const XcaRecord xca = XcaRecord::read(path);
    (void)xca.validity_start();
    for (int beam = 1; beam <= 7; ++beam)
      for (int pol = 0; pol < 4; ++pol) (void)xca.elevation_gains(beam, pol);
#else
    const XchRecord xch = XchRecord::read(path);
    (void)xch.validity_stop();
    (void)xch.loop_factors(0);
    (void)xch.loop_factors(1);
#endif
  } catch (const sar::base::CErrorExceptionManager&) {
  }
  return 0;
}

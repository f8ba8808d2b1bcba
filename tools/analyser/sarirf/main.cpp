// sarirf: image quality analysis of a complex raster (see analyser/cli.hpp).
#include <iostream>
#include <string>
#include <vector>

#include "analyser/cli.hpp"
#include "dsp/fft.hpp"

int main(int argc, char** argv) {
  // A few small transforms per target: planning them at once beats timing candidates.
  sar::dsp::set_fft_planning(sar::dsp::FftPlanning::Estimate);
  const std::vector<std::string> args(argv + 1, argv + argc);
  return sar::analyser::run_sarirf(args, std::cout, std::cerr);
}

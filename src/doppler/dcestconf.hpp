#pragma once
// Configuration of the Doppler centroid estimator, section "DCestConf" of the parameter file.
#include <array>
#include <cstdint>
#include <string>

namespace sar::doppler {

struct dcestconf {
  int32_t progressFlag = 0;  // copied from the job record
  int32_t Flag_incore = 0;   // copied from the job record
  int32_t Memory = 0;
  double RgBand = 0.0;
  int32_t Blocks = 0;
  int32_t Blockl = 0;
  double AnLen = 0.0;
  double Kthr = 0.0;
  double Lookbf = 0.0;
  double Lookbt = 0.0;
  double Lookrp = 0.0;
  double Lookrs = 0.0;
  int32_t Decfac = 0;
  int32_t Flength = 0;
  double Dftstep = 0.0;
  double Fftrgprc = 0.0;
  double Fftazprc = 0.0;
  double Peakwid = 0.0;
  double Minamb = 0.0;
  double Maxamb = 0.0;
  double Sthr = 0.0;
  int32_t Nbestblocks = 0;
  int32_t Nummlbf = 0;
  int32_t Nwdarblocks = 0;
  double Varthr = 0.0;
  int32_t Patchs = 0;
  int32_t Patchl = 0;
  int32_t Dswst = 0;
  int32_t Amb_flag = 0;
  std::array<int32_t, 7> Pol_Weights{};
  // Filled by the job before the estimation.
  std::string inputPath;
  std::string outputDir;
  double wantedPolyPoints = 0.0;
};

}  // namespace sar::doppler

#pragma once
// Acquisition records filled by the level 0 intake and read by every later stage.
#include <cstdint>
#include <string>

namespace sar::envisat {

/// Per-channel acquisition parameters. Times: range times are two-way seconds, azimuth times sec85.
struct sarpar {
  std::string outputDir;   // directory of the run's intermediate files
  std::string extrPath;    // base path of the extracted raw lines ("<dir>/EXTR")
  std::string slcPath;     // focused product
  std::string rgfPath;     // range-focused lines ("<dir>/EXTR.rgf")
  std::string reportPath;  // "<dir>/report.bin"
  double samplingRate = 0.0;     // Hz
  double carrierFrequency = 0.0; // Hz
  double prf = 0.0;              // Hz
  double nearRangeTime = 0.0;    // s, two-way
  double azimuthStartTime = 0.0; // sec85
  int32_t lines = 0;
  int32_t samples = 0;
};

/// The product paths of a job: level 0 product, ASA_INS, ASA_XCA, a slot the extraction fills,
/// and the orbit file.
struct enviauxfiles {
  std::string level0;
  std::string ins;
  std::string xca;
  std::string extracted;
  std::string orbit;
};

}  // namespace sar::envisat

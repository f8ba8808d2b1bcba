#pragma once
// Records of the level 0 intake: the extraction request with its side tables and the job's
// product paths. The per-channel acquisition record is the sensor-neutral `metadata::sarpar`.
#include <array>
#include <cstdint>
#include <memory>
#include <string>
#include <vector>

#include "io/line_store.hpp"
#include "metadata/acquisition.hpp"

namespace sar::envisat {

using metadata::kMaxSwstChanges;
using metadata::sarpar;

/// What a level 0 extraction selects.
enum ExtractKind : int32_t { kExtractEchoes = 0, kExtractCalibration = 1, kExtractNoise = 2 };

/// The extraction request and its per-line side tables. The side tables hold one entry per
/// output line and channel (index 0 and 1; image mode uses 0 only, wide swath none).
struct extconf {
  int32_t skip_percent = 0;       // share to skip, 0 to 100; negative becomes 0
  int32_t extract_percent = 100;  // share to extract; 0 or below, or past 100 with the skip: the remainder
  int32_t extract_kind = kExtractEchoes;
  int32_t acquisition_mode = 0;   // result: 0 IM, 1 WS, 2 APC, 3 APH, 4 APV, 5 GM
  std::array<std::vector<int32_t>, 2> line_swst;      // SWST code in force
  std::array<std::vector<int32_t>, 2> line_replaced;  // 1: filled, padded or calibration stand-in
  std::array<std::vector<int32_t>, 2> line_counter;   // mode packet counter of a genuine line, else 0
  // When the whole scene is processed in memory, the echo lines of each channel are kept in a
  // store instead of its line file and go straight on to range compression.
  bool lines_in_memory = false;
  std::array<std::shared_ptr<io::LineStore>, 2> line_stores;  // result, with lines_in_memory
};

/// The product paths of a job: level 0 product, ASA_INS, ASA_XCA, the ASA_XCH slot (which the
/// extraction may fill), and the orbit file (DOR_VOR or DOR_POR).
struct enviauxfiles {
  std::string level0;
  std::string ins;
  std::string xca;
  std::string extracted;  // ASA_XCH
  std::string orbit;
};

}  // namespace sar::envisat

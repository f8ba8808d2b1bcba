#pragma once
// Level 0 extraction: ASAR source packets to per-channel files of decoded complex range lines.
//
// The walk follows a table of the packets the instrument's timeline expects, indexed by the
// mode packet counter, and the stream side by side. A line the table expects and the stream
// lacks is filled with a copy of the last good line and flagged; a packet the table does not
// expect is skipped; a stretch of corrupt bytes is crossed by searching for the next head that
// scores clean. The output thus always has the regular line grid that focusing needs.
//
// Channel line file: per line a native float32 range time of the first sample,
//   t = swst / fs + rank / prf - range gate bias,
// then `samples` complex values as native float32 pairs I, Q.
#include <cstdint>
#include <functional>
#include <span>
#include <string>
#include <vector>

#include "envisat/fbaq.hpp"
#include "envisat/level0_format.hpp"
#include "envisat/line_table.hpp"
#include "envisat/records.hpp"

namespace sar::envisat {

/// Builds the table of a product and fills the channels' acquisition parameters (the fields
/// taken from the first packets and ASA_INS). Returns 0 or an error code.
using TableBuilder = std::function<int(const std::string& level0Path, const std::string& insPath, int mode,
                                       LineTable& table, std::span<sarpar> channels)>;

/// Progress in percent, 0 to 100, called when the number grows.
using ProgressSink = std::function<void(int percent)>;

/// Walk range in table indices for the request, after the percentages are reduced (and written
/// back). Returns 1 for a skip above 100 ("Wrong SkipLines parameter!"), else 0.
struct WalkRange {
  std::int64_t first = 0;
  std::int64_t last = 0;  // exclusive
  std::int32_t startUnits = 0;
  std::int32_t extractUnits = 0;
};
int walk_range(extconf& conf, const LineTable& table, WalkRange& range);

/// The walk itself, once the headers, the table, the decoding tables and the channels'
/// parameters are known. `channels` must hold `header.channels` entries with sampling
/// frequency, PRF, samples, rank and range gate bias set. Returns 0, or 1 for a bad skip.
/// Bad input (truncated product, no clean head where one is needed) raises the file I/O code
/// naming the file and the byte; partial output files are then removed.
int extract_level0(const std::string& level0Path, const Level0Header& header, LineTable& table,
                   const FbaqTables& fbaq, std::span<const float> gains, std::span<sarpar> channels, extconf& conf,
                   const ProgressSink& progress = {});

/// Whole extraction of a product: headers, FBAQ and gain tables from ASA_INS, the table from
/// `buildTable`, then the walk with the "EXTRACTING LEVEL 0" progress bar. `channels` receives
/// one `sarpar` per channel of the mode (its paths set by the caller). Returns 0, 1 for a bad
/// skip, or the builder's code.
int envi_extract(const std::string& level0Path, const std::string& insPath, const std::string& xchPath,
                 std::vector<sarpar>& channels, extconf& conf, const TableBuilder& buildTable);

}  // namespace sar::envisat

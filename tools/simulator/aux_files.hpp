#pragma once
// Auxiliary products that match a simulated acquisition: copies of real ASA_INS and ASA_XCA
// products with a few fields rewritten in place, so that every other byte (sizes, headers,
// tables the simulation does not touch) stays exactly as the instrument's products have it.
//
// Rewritten in both: the MPH product name (and the file name with it) and the validity period
// (SENSING_START, SENSING_STOP). Rewritten in ASA_INS where the simulation differs from the
// template: the FBAQ reconstruction tables for I and Q (always: the simulator's own table), the
// carrier and sampling frequencies, the range gate bias, the gain model, and the rows of the
// swath tables (echoes per burst or block, rank) of the beams the acquisition used. The
// template file itself is only read.
#include <array>
#include <span>
#include <string>

#include "simulator/simulator.hpp"

namespace sar::simulator {

/// Validity period of the written products, sec85.
struct AuxValidity {
  double start = 0.0;
  double stop = 0.0;
};

/// Validity around an acquisition: from the midnight before `sensing_start` to two days later.
AuxValidity aux_validity_around(double sensing_start);

/// Swath tables of ASA_INS: one per timeline, indexed by the beam code of the packets (1-7 for
/// IM and AP, 15-19 for WS).
enum class InsTable { kIm, kAp, kWs };

/// One row: echoes per burst (IM, WS) or per block (AP), and the rank. An entry below 0 is not
/// written.
struct InsSwathRow {
  InsTable table = InsTable::kIm;
  int beam = 2;
  int echoes = -1;
  int rank = -1;
};

/// The row of a beam as an ASA_INS product holds it. Throws std::runtime_error for a file that
/// is no ASA_INS product, std::invalid_argument for a beam outside the table.
InsSwathRow read_ins_swath_row(const std::string& ins_path, InsTable table, int beam);

/// Writes the ASA_INS copy into `out_dir`, with the rows given; returns its path. Throws
/// std::runtime_error when the template cannot be read or is no ASA_INS product.
std::string write_ins_file(const std::string& template_path, const ImParameters& im, std::span<const InsSwathRow> rows,
                           const AuxValidity& validity, const std::string& out_dir);

/// Two-way elevation pattern of one beam slot: 201 gains (dB) of ASA_XCA, `step_deg` apart,
/// the middle one at the look angle ASA_INS gives the slot.
struct ElevationPattern {
  std::array<float, 201> gain_db{};
  double centre_deg = 0.0;
  double step_deg = 0.05;
  /// Amplitude factor 10^(dB / 20) at a look angle (degrees from the geocentric vertical at the
  /// satellite), linear between entries, the end entries held outside the table.
  double amplitude(double look_deg) const;
};

/// Beam slots (1-based) of the wide swath sub-swaths SS1-SS5 in the ASA_INS and ASA_XCA
/// pattern tables.
inline constexpr std::array<int, 5> kWsPatternSlot = {8, 3, 4, 5, 6};

/// The pattern of `slot` and polarisation `pol` (0 H/H, 1 V/V) from an ASA_XCA and an ASA_INS
/// product. Throws std::runtime_error for files that are no such products.
ElevationPattern read_elevation_pattern(const std::string& xca_path, const std::string& ins_path, int slot, int pol);

/// Writes the ASA_XCA copy into `out_dir`; returns its path.
std::string write_xca_file(const std::string& template_path, const AuxValidity& validity,
                           const std::string& out_dir);

}  // namespace sar::simulator

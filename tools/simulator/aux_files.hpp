#pragma once
// Auxiliary products that match a simulated acquisition: copies of real ASA_INS and ASA_XCA
// products with a few fields rewritten in place, so that every other byte (sizes, headers,
// tables the simulation does not touch) stays exactly as the instrument's products have it.
//
// Rewritten in both: the MPH product name (and the file name with it) and the validity period
// (SENSING_START, SENSING_STOP). Rewritten in ASA_INS where the simulation differs from the
// template: the FBAQ reconstruction tables for I and Q (always: the simulator's own table), the
// carrier and sampling frequencies, the range gate bias, the IM rank of the beam and the gain
// model. The template file itself is only read.
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

/// Writes the ASA_INS copy into `out_dir`; returns its path. Throws std::runtime_error when the
/// template cannot be read or is no ASA_INS product.
std::string write_ins_file(const std::string& template_path, const ImParameters& im, int swath_rank,
                           const AuxValidity& validity, const std::string& out_dir);

/// Writes the ASA_XCA copy into `out_dir`; returns its path.
std::string write_xca_file(const std::string& template_path, const AuxValidity& validity,
                           const std::string& out_dir);

}  // namespace sar::simulator

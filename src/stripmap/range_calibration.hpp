#pragma once
// Range antenna calibration of range-compressed stripmap lines: one real gain per range sample,
// the same for every line, that removes the two-way elevation antenna pattern, the range
// spreading loss and the incidence dependence of the ground cell:
//
//   G(i) = (1 + t_i / t_near)^1.5 sqrt(sin(incidence(t_i))) / P(look(t_i)),   t_i = i / fs
//
// P is the amplitude pattern of procparm (patternStep degrees apart around patternCentre, the
// table's middle entry at the centre), linear between entries and extended along its two end
// entries outside the table. Look and incidence angles come from procparm's polynomials in
// degrees, coefficients a0, a1, a4, a5, a6 as a polynomial in t_i. The incidence term is the
// square root of sin(theta) on amplitude, so that power gets sin(theta): the backscatter of a
// ground cell whose area grows as 1 / sin(theta).
#include <complex>
#include <span>
#include <vector>

#include "metadata/acquisition.hpp"
#include "stripmap/procparm.hpp"

namespace sar::stripmap {

/// out[i] = 1 / P(look angle of sample i); `coeff` five look coefficients in radians.
int InterpRgAnt(const procparm& proc, std::span<const double> coeff, double fs, std::span<double> out);

/// out[i] = (1 + t_i / t_near)^1.5 sqrt(sin(theta_i)); `coeff` five incidence coefficients in
/// radians.
int IncidCompCoeff(std::span<const double> coeff, double fs, std::span<double> out, double tNear);

/// The gain vector of `samples` range samples. Empty when the pattern or the geometry is missing.
std::vector<double> range_calibration_gain(const metadata::sarpar& par, const procparm& proc, int samples);

/// Multiplies each of `lines` rows (`pitch` apart) of `samples` samples by the gain.
void apply_range_gain(std::span<std::complex<float>> rows, int lines, int pitch, std::span<const double> gain);

/// The stage: the gain over the core matrix (Flag_incore) or, block by block of Azblk lines,
/// over the range file par.rgfPath. 0, 10 for missing inputs, 1 for a file failure.
int range_antenna_calibration(const metadata::sarpar& par, procparm& proc);

}  // namespace sar::stripmap

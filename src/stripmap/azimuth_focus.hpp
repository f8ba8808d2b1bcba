#pragma once
// Azimuth focusing of a range-compressed scene: azimuth blocks, range sub-blocks within each,
// both overlapping so that the edges spoiled by circular transforms are thrown away, and the
// Doppler centroid re-evaluated per sub-block so that a centroid varying with range and time
// is followed without resampling.
//
// Output grid. Focused line 0 is raw line h_a (half the azimuth overlap) moved by the azimuth
// shift; focused sample 0 is range-compressed sample h_r moved by the range shift. With both
// shifts off (the default) the image is in zero-Doppler geometry on the raw range grid:
//   first line time   = first raw line time + h_a / PRF
//   first sample time = near range time + h_r / fs
#include <cstdint>

#include "metadata/acquisition.hpp"
#include "stripmap/omegak.hpp"
#include "stripmap/procparm.hpp"

namespace sar::stripmap {

using metadata::sarpar;

/// What focazwk did to one sub-block.
struct focazwk_result {
  int32_t lines = 0;
  int32_t samples = 0;
  double rangeSpacing = 0.0;  // m
  double fd = 0.0;            // block centroid, Hz
  double azimuthShift = 0.0;  // s
  double rangeShift = 0.0;    // s
};

/// The whole stage, in file mode (range file in, SLC file out, one azimuth block in memory) or
/// core mode (procparm::matrix packed in place at the focused pitch).
int azimuthfoc(const sarpar& par, procparm& proc, const azimuthconf& az);
/// One azimuth block held in wk.data (lines x samples): range sub-blocks of `subSamples` with a
/// full overlap of `overlap` samples; `poly` is the block's centroid polynomial in range time
/// (five coefficients, constant first) about `reference`.
int multirg(wkparm& wk, focazwk_result& result, int32_t subSamples, int32_t overlap, const double poly[5],
            double reference);
/// One sub-block: geometry, grid, shifts, then the kernel of wk.PerformInterpolation.
int focazwk(wkparm& wk, focazwk_result& result);
/// Azimuth and range shift of the block, metres.
void WKShifts(const wkparm& wk, double& sa, double& sr);
/// Centroid at the scene centre and the squint shifts that a beam-centre geometry would take
/// (0 when either configured shift is set).
double getDCshift(const sarpar& par, const procparm& proc, const azimuthconf& az, double& rangeShift,
                  double& azimuthShift);

}  // namespace sar::stripmap

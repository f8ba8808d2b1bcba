#pragma once
// Uniform clutter for wide swath products, and sub-swath windows that overlap.
//
// Each sub-swath sees its own field of cells (clutter.hpp), one cell a line of its PRF grid and
// a sample, spanning the whole product: bursts of one sub-swath that look at the same ground see
// the same cells, so their speckle is as independent as their Doppler bands make it. Adjacent
// sub-swaths see independent realisations of the same statistics in their overlap (their cell
// grids differ in PRF); the joined image keeps only one of them on either side of a seam.
//
// A burst's lines lie off the sub-swath's PRF grid by a fraction of a PRI that changes from
// burst to burst; each line takes the clutter of the nearest grid line. The scene thus moves by
// at most half a PRI of flight (about 2 m) from one burst to the next, far below the burst's
// azimuth resolution.
//
// Level. The scene is uniform in radar brightness (power per unit slant range and azimuth
// length): with no elevation pattern (as for the point targets), the raw clutter power of a
// sample falls as R^-3 with its slant range R (R^-4 of the two-way path times the length of the
// footprint, which grows with R), and equals the asked power at the middle of the reference
// sub-swath. Cells of a sub-swath of higher PRF lie closer along the track and carry less power
// each, so every sub-swath sees the same raw level at the same range.
#include <array>
#include <complex>
#include <cstddef>
#include <span>
#include <string>
#include <vector>

#include "simulator/attitude.hpp"
#include "simulator/clutter.hpp"
#include "simulator/orbit_model.hpp"

namespace sar::simulator {

struct SimulationConfig;

/// What the clutter needs of one sub-swath's acquisition.
struct WsClutterSwath {
  double prf = 0.0;
  double near_range_time = 0.0;  // two-way time of sample 0, s
  double pulse_length = 0.0;
  double chirp_bandwidth = 0.0;
};

/// Gain on the cells of a sub-swath at slant range `r` (m): raw power as R^-3, equal to the asked
/// power at `r_ref`, for cells scaled to the asked power at the sub-swath's middle range `r_mid`.
double ws_clutter_cell_gain(double r, double r_mid, double r_ref);

/// An echo line of the product: its sub-swath and its time, s after the first packet.
struct WsEchoLine {
  int swath = 0;
  double offset = 0.0;
};

/// The clutter of the echo lines of a product, made sub-swath by sub-swath (one sub-swath's
/// transforms in memory at a time) and kept for those lines only: a burst holds a fifth of its
/// sub-swath's PRIs at most.
class WsClutter {
 public:
  /// `attitude`: as flown (its beam centre sets the clutter's centroid); `first_offset`: s from
  /// the orbit epoch (the scene time) to the first packet; `span`: s from the first packet to the
  /// last; `reference`: the sub-swath where the power is `config.clutter`'s.
  WsClutter(const SimulationConfig& config, const OrbitModel& orbit, const Attitude& attitude,
            const std::array<WsClutterSwath, 5>& swaths, int reference, double first_offset, double span,
            const std::vector<WsEchoLine>& lines);
  /// The clutter of echo line `index` of the list given: samples of the configuration's window.
  std::span<const std::complex<float>> line(std::size_t index) const;

 private:
  std::size_t samples_ = 0;
  std::vector<std::complex<float>> lines_;
};

/// Sets every two-way elevation pattern of an ASA_XCA product (beam slots 1 to 8, the four
/// polarisations: 201 big-endian floats of dB each) to 0 dB, in place.
void flatten_elevation_patterns(const std::string& xca_path);

/// Incidences (degrees) for the five sub-swaths such that adjacent range windows start `spacing`
/// samples apart around the target sub-swath's window (centred on the first target's echo at
/// zero Doppler; a beam steered to zero Doppler): with a spacing below the focused width
/// (the window less the pulse), a small product whose sub-swaths meet, as a real one's do.
std::array<double, 5> ws_adjoining_incidences(const SimulationConfig& config, int spacing);

}  // namespace sar::simulator

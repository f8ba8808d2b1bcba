#pragma once
// Distributed clutter for the test-product simulator: the raw echo of a field of scatterers,
// one per line and sample, made in the two-dimensional frequency domain.
//
// Scene. Cell (m, n) holds a scatterer whose zero-Doppler time is that of line m + line_offset
// and whose zero-Doppler two-way time is near_range_time + (n + sample_offset) / fs, that is
// the echo of a cell at zero Doppler starts at sample n. A cell of complex value a echoes like a
// point target of amplitude a of the simulator's point model: the up-chirp
// exp(j pi K (u - Tp/2)^2) over [0, Tp), the carrier phase exp(-j 4 pi R / lambda), stop and go
// at the line times, and the two-way pattern sinc^2(x) of a uniform antenna of length L with
//   x = L (fD - fdc(tau)) / (2 Vs),
// fD the Doppler of the line of sight at the carrier, fdc the absolute beam-centre Doppler
// centroid and Vs the satellite's Earth-fixed speed.
//
// Transfer function. A cell at two-way time tau has, by stationary phase on the hyperbolic
// range R(t)^2 = R0^2 + Vr^2 t^2 (Vr the effective velocity of the orbit at that range), the
// two-dimensional spectrum (fa azimuth, fr range frequency, F = f0 + fr)
//   PRF P(fr) sinc^2(L (fa f0 / F - fdc) / (2 Vs)) sqrt(c R0 F^2 / (2 Vr^2 D^3)) e^(-j pi/4)
//       e^(-j 2 pi D tau) e^(+j 2 pi fr near),   D = sqrt(F^2 - c^2 fa^2 / (4 Vr^2)),
// P the DFT of the sampled chirp. The pattern is thus centred on fdc (f0 + fr) / f0: the
// centroid scales with the radar frequency, as for a real scene. Lines sample azimuth at the
// PRF, so the spectrum of a bin fa0 is the sum over the aliases fa = fa0 + k PRF, with fa0 in
// the band of one PRF centred on fdc; any |fdc|, many PRFs included, is represented exactly.
// Only the main lobe of the pattern, |x| <= pattern_extent (1: first nulls), is simulated;
// beyond it lies 0.3 % of the two-way energy.
//
// Approximation. The factor e^(-j 2 pi D tau) is split as e^(-j 2 pi D(fa, f0) tau), applied
// exactly to every range column (azimuth compression, range walk and the carrier phase are
// exact per cell), times e^(-j 2 pi (D(fa, F) - D(fa, f0) - fr) tau_ref) with the reference
// time of a range block, as are Vr and fdc in the rest of the transfer function. The phase left
// out is 2 pi fr (F / D - 1) (tau - tau_ref) to first order: a cell is displaced in range by
// (f0 / D - 1) (tau - tau_ref) ~ c^2 fa^2 / (8 Vr^2 f0^2) (tau - tau_ref), 1.6e-4 of its distance
// to the block centre at 2.7 PRF of centroid (0.08 sample at the edge of a block of 1024
// cells), 2e-5 at zero centroid; the spread of that shift over the Doppler band blurs it by
// less. Random clutter made with blocks of 128 cells differs from the 1024-cell result by
// 4 % rms at 2.7 PRF. The centroid is held constant over a block; blocks are narrowed until
// fdc varies by at most 5 Hz over one (down to 128 cells). The smooth factors are evaluated
// exactly every 16 cells and every 8 range bins (after taking out the linear phase of the range
// walk) and interpolated in between; that costs less than 1e-4 of the signal.
//
// Processing. Lines are made in azimuth blocks; a block's transform holds its lines plus one
// aperture of cells, which it shares with its neighbours, so the lines do not depend on the
// blocking (to float rounding). Per block: the cells of a range block are transformed in
// azimuth, given the exact per-column phase, transformed in range alias by alias, multiplied by
// the transfer function, brought back to range and added to the block's range-Doppler
// accumulator, which one inverse azimuth transform turns into lines. Transforms are planned by
// estimate, so that runs are reproducible. Memory: 8 bytes x FFT lines x (samples + cells of a
// range block); 390 MB for 30000 lines of 5616 samples (FFT lines 7500, made in 29 s of one
// core at zero centroid), 71 MB for 2048 lines of 1024 samples (0.9 s).
#include <complex>
#include <cstdint>
#include <functional>
#include <span>
#include <string>
#include <vector>

#include "simulator/orbit_model.hpp"

namespace sar::simulator {

enum class ClutterContrast {
  kLow,   // homogeneous: circular Gaussian reflectivity of constant power (image contrast 1)
  kHigh,  // lognormal texture, sparse bright points and a land/water edge (image contrast 15 to 17)
};

/// "low" or "high"; `clutter_contrast_from_name` throws std::invalid_argument for other names.
const char* clutter_contrast_name(ClutterContrast contrast);
ClutterContrast clutter_contrast_from_name(const std::string& name);

/// Fills out[i] with the value of cell (row, first_col + i). Rows and columns may be negative:
/// cells before the first line and before the near range echo into the product too.
using Reflectivity = std::function<void(long long row, long long first_col, std::span<std::complex<float>> out)>;

struct ClutterOptions {
  // Mean clutter power of a raw complex sample in dB relative to 1 count^2, before the receive
  // gain, at mid range; below -100: no clutter.
  double power_db = -200.0;
  ClutterContrast contrast = ClutterContrast::kLow;
  bool enabled() const { return power_db >= -100.0; }
};

/// The acquisition as the clutter sees it.
struct ClutterGeometry {
  int lines = 0;
  int samples = 0;
  double prf = 0.0;
  double sampling_frequency = 0.0;
  double carrier_frequency = 0.0;
  double pulse_length = 0.0;
  double chirp_bandwidth = 0.0;
  double near_range_time = 0.0;  // two-way time of sample 0, s
  double antenna_length = 10.0;  // m
  double satellite_speed = 0.0;  // Earth-fixed, m/s: scales the azimuth pattern
  std::function<double(double tau)> effective_velocity;  // Vr at a two-way time, m/s
  std::function<double(double tau)> doppler_centroid;    // absolute beam-centre centroid, Hz
  double line_offset = 0.0;    // zero-Doppler line of cell row 0
  double sample_offset = 0.0;  // zero-Doppler sample of cell column 0
  double pattern_extent = 1.0;  // |x| simulated
  int range_block = 1024;       // cells per range block at most
  int max_fft_lines = 8192;     // azimuth transform length aimed at (bounds the memory)
};

/// Fills the orbit's part of `g` for the scene seen at `time_offset` s after the orbit epoch:
/// the satellite speed there and, for ground points of height `height` at zero Doppler across
/// the range of the product (tabulated, linearly interpolated), the effective velocity Vr.
/// Vr = sqrt(R0 R'') at zero Doppler. With a centroid (set `g.doppler_centroid` first) the
/// cells that echo at `time_offset` pass zero Doppler up to seconds away: Vr is taken for the
/// point at that zero-Doppler time, and where the beam centre lies more than 0.1 s from it the
/// hyperbola is fitted to the orbit's range over the main lobe, weighted by the pattern; at
/// 2.7 PRF of centroid this takes the phase error of a cell against the point-target model from
/// 0.5 rad (Vr of the middle line's zero Doppler) to 0.004 rad.
void set_orbit_geometry(ClutterGeometry& g, const OrbitModel& orbit, double time_offset, double height);

/// Energy of the echo of a unit cell at mid range: pulse samples times the sum over lines of
/// the squared two-way pattern. A white reflectivity of power s^2 gives raw samples of mean
/// power s^2 times this.
double clutter_cell_energy(const ClutterGeometry& g);

/// The random scene of `options` (deterministic in `seed`, any order of rows), scaled so that
/// the raw samples of `g` have the mean power of `options.power_db`. Image contrast is the
/// std / mean of the intensity of the cells, i.e. of a perfectly focused single-look image.
/// Low: circular Gaussian cells of constant power, contrast 1. High: land with lognormal
/// texture (sigma 1 in log, correlated over about 64 lines by 16 samples) and one bright point
/// of +30 dB in 5000 cells, water at -15 dB (speckle only) beyond an edge that meanders by
/// +-3/16 of the window around the middle of the cells echoing into it; contrast 15 to 17, set
/// by the bright points; the expected mean power is the one asked for (within 1 dB on a window,
/// as the edge meanders).
Reflectivity random_reflectivity(const ClutterOptions& options, const ClutterGeometry& g, uint64_t seed);

/// The clutter echo of a scene, made azimuth block by azimuth block as lines are asked for.
class ClutterEcho {
 public:
  /// Throws std::invalid_argument on an unusable geometry.
  ClutterEcho(ClutterGeometry geometry, Reflectivity reflectivity);

  const ClutterGeometry& geometry() const { return g_; }
  /// `samples` values of line l (0 <= l < lines), valid until the next call. Asking for lines
  /// in increasing order computes every azimuth block once.
  std::span<const std::complex<float>> line(int l);

  int fft_lines() const { return na_; }
  int block_lines() const { return mb_; }
  int range_blocks() const { return range_blocks_; }
  int range_fft() const { return range_fft_; }

 private:
  void compute_block(int block);

  ClutterGeometry g_;
  Reflectivity reflectivity_;
  int pulse_samples_ = 0;
  int first_cell_ = 0;   // column of the first cell of range block 0
  int block_cells_ = 0;  // cells per range block
  int range_blocks_ = 0;
  int range_fft_ = 0;
  int pad_ = 0;          // FFT position of a block's first cell
  long long az_lo_ = 0;  // line offsets of a cell's echo, from az_lo_ to az_hi_
  long long az_hi_ = 0;
  int na_ = 0;  // azimuth transform length
  int mb_ = 0;  // lines per azimuth block
  int aliases_ = 0;
  int block_ = -1;
  long long row0_ = 0;  // cell row of transform row 0 of the block in hand
  std::vector<double> chirp_re_, chirp_im_;  // spectrum of the sampled chirp, range_fft_ bins
  std::vector<std::complex<float>> accumulator_;  // samples x na_, sample by sample
  std::vector<std::complex<float>> line_;
};

/// Adds the clutter echo of `reflectivity` to `echo` (lines x samples of g, line by line).
void add_clutter(std::span<std::complex<double>> echo, const ClutterGeometry& g, const Reflectivity& reflectivity);
/// The same for the random scene of `options`.
void add_clutter(std::span<std::complex<double>> echo, const ClutterGeometry& g, const ClutterOptions& options,
                 uint64_t seed);

}  // namespace sar::simulator

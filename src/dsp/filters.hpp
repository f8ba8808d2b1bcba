#pragma once
// Filter design: least-squares interpolators and equiripple low-pass prototypes.
//
// Least-squares (GLS) interpolators reconstruct a band-limited sequence at a fractional
// position: for a band of normalised width B, the taps w minimise the mean square error of
// sum_i x[p + i - n] w[i] against x(p + offset) over the band, which gives T w = p with the
// Toeplitz band autocorrelation T[i][j] = B sinc(B (i - j)) and the band cross-correlation
// p[i] = B sinc(B (i - n - offset)), n = (N - 1)/2 the centre tap.
//
// Status: 0 success; the matrix inversion's error (1, singular); 10 a rejected input. A table
// span shorter than its dimensions throws std::invalid_argument with both sizes.
#include <span>

#include "dsp/complex.hpp"

namespace sar::dsp {

/// sin(pi u) / (pi u), 1 at u = 0 exactly.
double sinc(double u);

/// A bank of P interpolators of N (odd) complex taps for a sequence whose band of width B
/// (0 < B <= 1, cycles per sample) is centred on half the sampling rate, i.e. whose continuous
/// form is s(t) exp(-j pi t) with s band-limited to |f| < B/2. table is P x N, row-major:
///   sum_{t=0}^{N-1} x[p + t - n] table[r][t]  ~  x(p + (r - (P - 1)/2) / (P - 1)),
/// so with P = 101 row r interpolates at offset (r - 50)/100, row 50 at the sample itself.
/// Each row is normalised to unit gain at the band centre. P below 2, an even N or a B
/// outside (0, 1] give 10.
int MakeGLS(std::span<fcomplex> table, int N, int P, double B);

/// The same bank for a sequence at baseband (band |f| < B/2): the real least-squares taps of
/// each row, normalised to unit DC gain, times the phase of the row's position on the half
/// sampling rate carrier, exp(-j pi x_r), the same for all taps of the row.
int MakeGLSlowpass(std::span<fcomplex> table, int N, int P, double B);

/// One real interpolator of N taps for the fractional shift `shift` (the output approximates
/// x(p + shift) from x[p + i - n]), designed for the band |f| < B/2 plus a second band of
/// width 1 - (B + gap) around half the sampling rate; the taps sum to 1. The second band
/// enters the cross-correlation with weight 1e-5 only: it tames the filter's response there
/// without asking it to reproduce that band.
int glsF(std::span<float> filter, int N, double shift, double B, double gap);
/// glsF with complex output (imaginary parts 0).
int glsFcomplex(std::span<fcomplex> filter, int N, double shift, double B, double gap);

/// Equiripple linear-phase (symmetric) multiband FIR filter of N taps by the Parks-McClellan
/// exchange algorithm. bands: nbands pairs of edges in cycles per sample, increasing within
/// [0, 0.5]; desired and weights: one value per band. The taps go to the real parts of
/// filter, imaginary parts 0. 10 for invalid bands, weights or N below 3.
int remezOBX(std::span<fcomplex> filter, int N, int nbands, std::span<const double> bands,
             std::span<const double> desired, std::span<const double> weights);

}  // namespace sar::dsp

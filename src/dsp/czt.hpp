#pragma once
// Chirp-Z transform on the kit's FFTs (Bluestein's factorisation).
//
// For each row of N samples x[n] it gives M samples
//   out[k] = sum_{n=0}^{N-1} x[n] exp(j n (a k - b)),  k = 0..M-1,
// i.e. the spectrum on an arc of the unit circle starting at angle -b with step a (radians per
// sample). With a = 2 pi / N, b = 0 and M = N it is the unscaled backward DFT; a = -2 pi df /
// fs, b = 2 pi f0 / fs zooms the forward spectrum onto f0 + k df.
#include <memory>
#include <span>

#include "dsp/complex.hpp"
#include "dsp/fft.hpp"

namespace sar::dsp {

namespace detail {
class CztTables;
}

/// Plans of one chirp-Z shape: a forward and a normalised backward transform of one row of
/// L = genpow(N + M - 1, 1) samples, in place, and the chirp tables of the steps it has run
/// with. The tables and the transformed kernel depend on N, M and a only, so they are made on
/// the first call with a step and reused by every later call with the same step (the input
/// chirp also depends on b and is made on each call, from the step's table). The tables are shared by copies
/// of the plan and guarded by a lock: one plan may be run from several threads at once.
struct czt_plan {
  fft_plan forward;
  fft_plan backward;
  int N = 0;  ///< input samples per row
  int M = 0;  ///< output samples per row
  int L = 0;  ///< transform length
  std::shared_ptr<detail::CztTables> tables;
};

/// Makes the plans for N inputs and M outputs. Returns 0; 10 when N or M is below 1 (the plan
/// is then empty).
int czt_makep_c(czt_plan& plan, int N, int M);

/// Transforms `rows` rows of N samples (input, rows x N) into rows of M samples (output,
/// rows x M); a and b in radians. Phases and all complex products are formed in double
/// precision from the float operands and rounded to float; the result does not depend on the
/// calls made before with the plan. Returns 0; 10 for an empty plan or negative rows. Throws
/// std::length_error when a buffer is too short.
int pczt_c(const czt_plan& plan, std::span<const fcomplex> input, std::span<fcomplex> output, double a, double b,
           int rows);

/// Releases the plans and the tables. Returns 0.
int czt_destp_c(czt_plan& plan);

/// One-shot chirp-Z: plan, run, release.
int czt_c(std::span<const fcomplex> input, int N, std::span<fcomplex> output, int M, double a, double b, int rows);

}  // namespace sar::dsp

#pragma once
// Per-sample loops of one Doppler line of the chirp-Z Stolt kernel, written as plain loops
// over arrays so that the compiler can turn them into vector code. They are built twice: for
// the x86-64 baseline and with AVX2 and FMA; the choice is made once per process, so every
// line of a run, on any thread, goes through the same code and gives the same bytes.
#include "dsp/complex.hpp"

namespace sar::stripmap::detail {

using dsp::fcomplex;

/// Reference phase of `count` chirp-Z bins whose wavenumbers are k = kStart + (first + u) dk:
/// phase[u] = (sqrt(k^2 - y2) - kx0) R0 - (k + shift) sr.
struct ReferencePhase {
  double kStart = 0.0, dk = 0.0, y2 = 0.0, kx0 = 0.0, R0 = 0.0, shift = 0.0, sr = 0.0;
  int first = 0;
};

/// Weights of bins k = kStart + (first + u) dk from a line's node table (az, g at k0 + i step, `nodes` of them),
/// linear between nodes and held at the ends; the normalisation sums s1 += g and
/// s2 += w^2 g over the bins with |k - kc| < band are added to s1 and s2.
struct NodeWeights {
  const double* az = nullptr;
  const double* g = nullptr;
  int nodes = 0;
  double k0 = 0.0, step = 0.0, kc = 0.0, band = 0.0;
};

/// Fractional chirp-Z bins of `count` output wavenumbers kx = kxStart + (first + u) kxStep on a line of
/// squared Doppler wavenumber y2: x[u] = (sqrt(kx^2 + y2) - kStart) / dk, and the phase that
/// turns their two neighbours back by half a bin with the line's turn:
/// phase[u] = pi (x - floor x) + turn.
struct OutputBins {
  double kxStart = 0.0, kxStep = 0.0, y2 = 0.0, kStart = 0.0, dk = 0.0, turn = 0.0;
  int first = 0;
};

struct LineKernels {
  void (*reference_phase)(const ReferencePhase&, int count, double* phase);
  void (*node_weights)(const NodeWeights&, double kStart, int first, double dk, int count, double* weight, double& s1,
                       double& s2);
  void (*output_bins)(const OutputBins&, int count, double* x, double* phase);
  /// out[u] = ((1 - t) z[p] - t z[p + 1]) (c[u] + j s[u]), p = floor(x[u]), t = x[u] - p; zero
  /// where p is outside 0..bins-1 (z holds bins + 1 samples).
  void (*two_point)(const fcomplex* z, int bins, const double* x, const double* s, const double* c, int count,
                    fcomplex* out);
};

/// The kernels of this processor.
const LineKernels& line_kernels();

namespace base_isa {
extern const LineKernels kernels;
}
namespace avx2 {
extern const LineKernels kernels;
}

}  // namespace sar::stripmap::detail

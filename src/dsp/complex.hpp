#pragma once
// Sample types of the signal processing kit.
//
// std::complex<T> is guaranteed to be laid out as T[2] with the real part first, which is the
// interleaved sample format of every raster and of the FFT engine.
#include <complex>

namespace sar::dsp {

/// One complex sample: two 32-bit floats, real part first.
using fcomplex = std::complex<float>;
/// The same in double precision, for phase and frequency arithmetic.
using dcomplex = std::complex<double>;

}  // namespace sar::dsp

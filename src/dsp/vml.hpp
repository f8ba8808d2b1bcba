#pragma once
// The two vector functions the burst focuser uses beside the transforms, in single precision.
#include <span>

namespace sar::dsp {

/// sines[i] = sin(angles[i]), cosines[i] = cos(angles[i]) for i < n. The angle is taken in
/// double precision, so large angles keep their phase. Throws std::invalid_argument for a
/// negative n or a span shorter than n.
void vsSinCos(int n, std::span<const float> angles, std::span<float> sines, std::span<float> cosines);

/// results[i] = values[i] ^ exponent for i < n (results may alias values). Throws as vsSinCos.
void vsPowx(int n, std::span<const float> values, float exponent, std::span<float> results);

}  // namespace sar::dsp

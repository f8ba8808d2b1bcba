#pragma once
// The turns of the column transforms: a chunk of columns of a row-major matrix copied into
// contiguous rows and back. The AVX2 forms move 4 x 4 tiles of samples; all forms give the same
// bytes (they only copy).
#include <cstdint>

#include "dsp/complex.hpp"

namespace sar::dsp::detail {

/// Rows of the source moved together, so that both sides of a turn touch whole cache lines
/// while the tile stays in the first-level cache.
inline constexpr int kTurnTileRows = 16;

/// t[k n + l] = src[l stride + k] for k < count, l < n.
void gather_columns_avx2(const fcomplex* src, std::int64_t stride, int n, int count, fcomplex* t);
/// dst[l stride + k] = t[k n + l] for k < count, l < n.
void scatter_columns_avx2(const fcomplex* t, int n, int count, fcomplex* dst, std::int64_t stride);

}  // namespace sar::dsp::detail

#pragma once
// The transform kit: batched 1-D and 2-D single-precision complex FFTs over row-major
// matrices, the choice of transform lengths and the half-swap of a spectrum.
//
// Direction codes, per dimension:
//    1  forward,  X[k] = sum_n x[n] exp(-j 2 pi k n / L), not scaled
//   -1  backward, x[n] = (1/L) sum_k X[k] exp(+j 2 pi k n / L)
//   -2  backward, not scaled
//    0  this dimension is not transformed
// A dimension of length 1 is never transformed nor scaled. The only normalisation of the kit
// is the 1/L of code -1, applied by the kit after the engine's unscaled transform, as one
// double-precision factor (1/row length)(1/column length) over the transformed region.
//
// The engine is FFTW (single precision). Plans are made when a kit plan is made, before the
// caller fills its buffers, and kept in a process-wide cache keyed by shape, stride,
// direction, placement and alignment, so a shape is planned once per process.
#include <cstddef>
#include <cstdint>
#include <memory>
#include <new>
#include <span>
#include <type_traits>
#include <utility>
#include <vector>

#include "dsp/complex.hpp"

namespace sar::dsp {

namespace detail {
class Stage;
}

/// A two-stage transform plan over a row-major matrix (rows of `rowPitch` samples).
/// Built by fft_makep_c, run by pfft_c any number of times, released by fft_destp_c or by
/// going out of scope. Copies share the same engine plans.
struct fft_plan {
  std::shared_ptr<const detail::Stage> rowStage;  ///< transforms along rows; null: not transformed
  std::int32_t rowPitch = 0;      ///< samples between the starts of two rows
  std::int32_t rowLength = 0;     ///< samples transformed in each row
  std::int32_t rowScale = 0;      ///< 1: row stage normalised by 1/rowLength
  std::int32_t rowDirection = 0;  ///< 1 forward, -1 backward, 0 none (after mapping -2 to -1)
  std::shared_ptr<const detail::Stage> colStage;  ///< transforms along columns; null: none
  std::int32_t rowCapacity = 0;   ///< rows available in the matrix
  std::int32_t colLength = 0;     ///< rows transformed (and scaled)
  std::int32_t colScale = 0;      ///< 1: column stage normalised by 1/colLength
  std::int32_t colDirection = 0;  ///< as rowDirection
  std::int32_t inPlace = 1;       ///< placement the plan was made for

  /// Samples a buffer must hold for this plan: (colLength - 1) rowPitch + rowLength.
  std::int64_t extent() const;
};

/// Makes a plan for `count` rows of `length` samples out of a matrix of `rows` rows of
/// `pitch` samples. Returns 0; 1 when pitch or rows is below 1; 2 when length exceeds pitch;
/// 3 when count exceeds rows; 4 when the row stage is refused (e.g. length or count below 1,
/// unknown direction code); 5 when the column stage is refused. On failure the plan is empty.
int fft_makep_c(fft_plan& plan, int pitch, int length, int rows, int count, int rowDirection, int colDirection,
                int inPlace);

/// Runs the row stage (input to output), then the column stage on its result (on the input
/// when there is no row stage), then the normalisation. Samples beyond rowLength in a row and
/// rows beyond colLength are not touched. Input and output are either the same buffer or do
/// not overlap. Throws std::length_error when a buffer is shorter than plan.extent().
/// Returns 0.
int pfft_c(const fft_plan& plan, std::span<const fcomplex> input, std::span<fcomplex> output);
/// In place.
int pfft_c(const fft_plan& plan, std::span<fcomplex> data);
/// In place, the result also multiplied by `gain` (in the same pass as the normalisation; an
/// empty plan leaves the data as it is, like the other forms).
int pfft_c(const fft_plan& plan, std::span<fcomplex> data, double gain);

/// Releases the plan's stages. Returns 0.
int fft_destp_c(fft_plan& plan);

/// One-shot: make a plan (in place exactly when input and output are the same buffer), run
/// it, release it. Returns the plan's error without touching the buffers, or 0.
int fft_c(int pitch, int length, int rows, int count, int rowDirection, int colDirection,
          std::span<const fcomplex> input, std::span<fcomplex> output);
/// In place.
int fft_c(int pitch, int length, int rows, int count, int rowDirection, int colDirection, std::span<fcomplex> data);

/// The first number at or after n, moving by `step`, whose only prime factors are 2, 3 and 5;
/// 5625 is never returned (the search goes on from 5626). 0 for n at or below 0 and when the
/// answer would not fit an int. A step below 1 counts as 1.
int genpow(int n, int step);

/// Half-swap of each of `rows` rows of n samples in place. Even n: the halves trade places.
/// Odd n: sample 0 lands at index (n - 1)/2. ifftshift is the exact inverse. Return 0.
int fftshift(std::span<fcomplex> buf, int n, int rows);
int ifftshift(std::span<fcomplex> buf, int n, int rows);

/// Aligned memory for transform buffers (64-byte alignment, so every buffer is in the
/// engine's fastest alignment class). fft_calloc zeroes; both give null on exhaustion or
/// overflow. fft_free accepts null.
void* fft_malloc(std::size_t bytes);
void* fft_calloc(std::size_t count, std::size_t size);
void fft_free(void* p);

/// std::allocator on fft_malloc, for vectors that are transformed.
template <class T>
struct fft_allocator {
  using value_type = T;
  fft_allocator() = default;
  template <class U>
  fft_allocator(const fft_allocator<U>&) noexcept {}
  T* allocate(std::size_t n);
  void deallocate(T* p, std::size_t) noexcept { fft_free(p); }
  template <class U>
  bool operator==(const fft_allocator<U>&) const noexcept { return true; }
};

/// A vector of samples in aligned memory.
using cvector = std::vector<fcomplex, fft_allocator<fcomplex>>;

/// fft_allocator whose growth leaves new samples unwritten (resize(n) without a value, or
/// vector(n)): for large matrices whose rows are written before they are read, so that their
/// pages are first touched by the threads that fill them, once, instead of being cleared by
/// one thread beforehand. A value given explicitly (assign(n, v), resize(n, v)) is written.
template <class T>
struct fft_uninit_allocator : fft_allocator<T> {
  using value_type = T;
  template <class U>
  struct rebind {
    using other = fft_uninit_allocator<U>;
  };
  fft_uninit_allocator() = default;
  template <class U>
  fft_uninit_allocator(const fft_uninit_allocator<U>&) noexcept {}
  template <class U, class... Args>
  void construct(U* p, Args&&... args) {
    if constexpr (sizeof...(Args) == 0 && std::is_trivially_copyable_v<U>) {
      // Left as the allocation found it.
    } else {
      ::new (static_cast<void*>(p)) U(std::forward<Args>(args)...);
    }
  }
  template <class U>
  bool operator==(const fft_uninit_allocator<U>&) const noexcept { return true; }
};

/// A matrix of samples in aligned memory, grown without clearing (see fft_uninit_allocator).
using cmatrix = std::vector<fcomplex, fft_uninit_allocator<fcomplex>>;

/// Engine settings. Threads: how many threads a large transform may use (0: the default,
/// OpenMP's or the hardware's count). The result does not depend on it: a batch is cut into
/// chunks that depend on the shape only, and every chunk runs the same plan.
void set_fft_threads(int threads);
int fft_threads();

/// How hard the engine plans a new shape. Estimate (the default) plans at once from the shape
/// alone, so a transform gives the same bytes in every run, in any batch, at any position of a
/// batch and on any thread count. Measure and Patient time candidate algorithms once per shape
/// and process: sometimes faster, but the choice (and so the rounding) can differ between runs.
enum class FftPlanning { Estimate, Measure, Patient };
void set_fft_planning(FftPlanning planning);
FftPlanning fft_planning();

/// Plans held by the cache, and a way to drop them (kit plans keep theirs alive).
std::size_t fft_cached_plans();
void fft_clear_cache();

template <class T>
T* fft_allocator<T>::allocate(std::size_t n) {
  if (n > static_cast<std::size_t>(-1) / sizeof(T)) throw std::bad_array_new_length();
  void* p = fft_malloc(n * sizeof(T));
  if (!p) throw std::bad_alloc();
  return static_cast<T*>(p);
}

}  // namespace sar::dsp

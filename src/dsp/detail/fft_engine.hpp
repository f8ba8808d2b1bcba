#pragma once
// The FFT engine under the kit: RAII FFTW plans, the process-wide plan cache and the chunked,
// threaded execution of one transform stage.
//
// Internal to sar_dsp: nothing outside src/dsp includes fftw3.h.
#include <compare>
#include <cstddef>
#include <memory>
#include <vector>

#include <fftw3.h>

#include "dsp/complex.hpp"

namespace sar::dsp::detail {

/// One batched 1-D transform as the engine sees it: `howmany` transforms of `n` samples whose
/// samples lie `stride` apart and whose starts lie `dist` apart. `sign` is FFTW_FORWARD (-1,
/// exp(-j...)) or FFTW_BACKWARD (+1).
struct BatchShape {
  int n = 0;
  int howmany = 0;
  int stride = 1;
  int dist = 1;
  int sign = FFTW_FORWARD;
  auto operator<=>(const BatchShape&) const = default;
};

/// Everything FFTW's new-array execution must see unchanged between planning and running:
/// the shape, the placement, the SIMD alignment of both arrays, the planner's thread count
/// and its flags.
struct PlanKey {
  BatchShape shape;
  bool inPlace = true;
  int alignIn = 0;
  int alignOut = 0;
  int threads = 1;
  unsigned flags = FFTW_MEASURE;
  auto operator<=>(const PlanKey&) const = default;
};

/// One fftwf_plan, planned on scratch arrays of the key's alignment, so that planning with
/// FFTW_MEASURE never touches caller data. Runs on any arrays of the same alignment.
class FftwPlan {
 public:
  explicit FftwPlan(const PlanKey& key);
  ~FftwPlan();
  FftwPlan(const FftwPlan&) = delete;
  FftwPlan& operator=(const FftwPlan&) = delete;

  bool valid() const { return plan_ != nullptr; }
  /// Thread-safe: FFTW's execute functions may run one plan from several threads at once.
  void execute(const fcomplex* in, fcomplex* out) const;

 private:
  fftwf_plan plan_ = nullptr;
};

/// The plan for `key` from the process-wide cache, planning it on first use. Planning is
/// serialised by one mutex. Null when the engine refuses the shape.
std::shared_ptr<const FftwPlan> cached_plan(const PlanKey& key);
std::size_t cached_plan_count();
void clear_plan_cache();

/// Engine settings shared by all stages.
int engine_threads();
void set_engine_threads(int threads);
unsigned planner_flags();
void set_planner_flags(unsigned flags);

/// FFTW's alignment class of a sample pointer.
int alignment_of(const fcomplex* p);

/// One stage of a kit plan (all rows or all columns). The batch is cut into chunks of a fixed
/// number of transforms that depends on the shape only; every chunk runs the same cached
/// plan, so the result is bitwise the same whatever the thread count. Chunks are spread over
/// the kit's threads; FFTW's own threads are never used, so no transform is split by thread count.
/// A normalisation factor is applied chunk by chunk while the chunk is still in cache.
class Stage {
 public:
  /// Null when the engine refuses the shape (no transform, no sample).
  static std::shared_ptr<const Stage> make(const BatchShape& shape, bool inPlace);
  /// Use make(): a bare stage has no plans yet.
  Stage(const BatchShape& shape, int chunk) : shape_(shape), chunk_(chunk) {}

  /// Whether the stage transforms columns of a row-major matrix (samples `stride` apart,
  /// neighbouring transforms adjacent). Such a stage turns each chunk of columns into rows of
  /// a contiguous buffer (a cache-tiled transpose), transforms those and turns them back:
  /// a transform whose samples lie a whole row apart misses the cache on every sample.
  bool turned() const { return shape_.stride > 1 && shape_.dist == 1; }
  /// Whether the stage transforms rows (contiguous samples). Rows and turned columns run one
  /// plan of a single transform per row, so a row's bytes cannot depend on its batch.
  bool rows() const { return shape_.stride == 1; }

  const BatchShape& shape() const { return shape_; }
  int chunk() const { return chunk_; }
  /// Runs the stage from `in` to `out` (equal pointers: in place), then multiplies every
  /// transformed sample by `scale` unless it is 1.
  void run(const fcomplex* in, fcomplex* out, double scale) const;

 private:
  PlanKey key_for(int howmany, bool inPlace, int alignIn, int alignOut, int threads) const;
  /// Key of the single-transform plan a turned stage runs on each row of its transposed chunks.
  PlanKey turned_key(int threads) const;
  /// Key of the single-transform plan of a row stage, for rows of the given alignment classes.
  PlanKey row_key(bool inPlace, int alignIn, int alignOut, int threads) const;
  std::shared_ptr<const FftwPlan> single_plan(const PlanKey& key) const;
  void run_turned(const fcomplex* in, fcomplex* out, double scale) const;
  void run_rows(const fcomplex* in, fcomplex* out, double scale) const;
  int planner_threads_for(int threads) const;

  BatchShape shape_;
  int chunk_;
  // Plans made when the stage was built, for buffers of the kit's own alignment (full chunk,
  // then the remainder if any), with their keys: a run on such buffers takes them without
  // going through the cache's lock, so per-line runs inside parallel loops do not queue.
  std::vector<std::shared_ptr<const FftwPlan>> warm_;
  std::vector<PlanKey> warmKeys_;
};

}  // namespace sar::dsp::detail

#include "dsp/detail/fft_engine.hpp"
#include "dsp/detail/transpose.hpp"

#include "base/parallel.hpp"

#include <algorithm>
#include <atomic>
#include <cstdint>
#include <map>
#include <mutex>
#include <new>
#include <stdexcept>
#include <thread>
#include <utility>

#include "base/parallel.hpp"

#ifdef _OPENMP
#include <omp.h>
#endif

namespace sar::dsp::detail {
namespace {

// A chunk holds about this many samples (512 KiB): large enough that FFTW's loop overhead
// vanishes, small enough that a turned chunk of columns stays in the second-level cache
// between its turn, its transforms, its normalisation and its turn back.
constexpr std::int64_t kChunkSamples = std::int64_t{1} << 16;
// Chunks are whole multiples of this many transforms, so that every chunk start keeps the
// SIMD alignment of the array start (8 samples = 64 bytes).
constexpr int kChunkQuantum = 8;
// Below this many samples a stage runs on the calling thread alone.
constexpr std::int64_t kParallelSamples = std::int64_t{1} << 17;

int default_threads() {
#ifdef _OPENMP
  return std::max(1, omp_get_max_threads());
#else
  return std::max(1, static_cast<int>(std::thread::hardware_concurrency()));
#endif
}

std::atomic<int> g_threads{0};
// Estimate by default: a measured plan depends on timings, so two runs of the same job (or the
// same rows cut into blocks of another size) could get other algorithms and other rounding.
std::atomic<unsigned> g_flags{FFTW_ESTIMATE};

// The planner lock outlives the cache: it is constructed first (the cache's constructor asks
// for it), so plans destroyed while the cache is torn down at exit can still take it.
std::mutex& planner_mutex() {
  static std::mutex m;
  return m;
}

struct PlanCache {
  PlanCache() {
    std::lock_guard lock(planner_mutex());
    fftwf_init_threads();
  }
  std::map<PlanKey, std::shared_ptr<const FftwPlan>> plans;
};

PlanCache& cache() {
  static PlanCache c;
  return c;
}

// Aligned scratch of FFTW's allocator, freed on scope exit.
struct Scratch {
  explicit Scratch(std::size_t bytes) : p(static_cast<unsigned char*>(fftwf_malloc(bytes))) {}
  ~Scratch() { fftwf_free(p); }
  Scratch(const Scratch&) = delete;
  Scratch& operator=(const Scratch&) = delete;
  unsigned char* p;
};

std::int64_t extent(const BatchShape& s) {
  return static_cast<std::int64_t>(s.howmany - 1) * s.dist + static_cast<std::int64_t>(s.n - 1) * s.stride + 1;
}

// Runs fn(i) for i in [0, count) on up to `threads` threads.
template <class Fn>
void parallel_for(int count, int threads, Fn&& fn) {
  threads = std::min(threads, count);
  if (threads <= 1) {
    for (int i = 0; i < count; ++i) fn(i);
    return;
  }
#ifdef _OPENMP
  // A chunk that throws (its plan or buffers cannot be had) must not end the process from
  // inside the region: the first failure comes out after it.
  base::ParallelFailure failure;
#pragma omp parallel for num_threads(threads) schedule(static)
  for (int i = 0; i < count; ++i) failure.run([&] { fn(i); });
  failure.rethrow();
#else
  std::vector<std::jthread> workers;
  workers.reserve(static_cast<std::size_t>(threads - 1));
  auto slice = [&](int t) {
    const int lo = static_cast<int>(static_cast<std::int64_t>(count) * t / threads);
    const int hi = static_cast<int>(static_cast<std::int64_t>(count) * (t + 1) / threads);
    for (int i = lo; i < hi; ++i) fn(i);
  };
  for (int t = 1; t < threads; ++t) workers.emplace_back(slice, t);
  slice(0);
#endif
}

void scale_samples(fcomplex* p, std::int64_t count, double f) {
  float* v = reinterpret_cast<float*>(p);
  const std::int64_t m = 2 * count;
  for (std::int64_t i = 0; i < m; ++i) v[i] = static_cast<float>(static_cast<double>(v[i]) * f);
}

}  // namespace

int engine_threads() {
  const int t = g_threads.load(std::memory_order_relaxed);
  return t > 0 ? t : default_threads();
}

void set_engine_threads(int threads) { g_threads.store(threads > 0 ? threads : 0, std::memory_order_relaxed); }

unsigned planner_flags() { return g_flags.load(std::memory_order_relaxed); }

void set_planner_flags(unsigned flags) { g_flags.store(flags, std::memory_order_relaxed); }

int alignment_of(const fcomplex* p) {
  return fftwf_alignment_of(const_cast<float*>(reinterpret_cast<const float*>(p)));
}

FftwPlan::FftwPlan(const PlanKey& key) {
  const BatchShape& s = key.shape;
  if (s.n < 1 || s.howmany < 1 || s.stride < 1 || s.dist < 1) return;
  const std::size_t bytes = static_cast<std::size_t>(extent(s)) * sizeof(fcomplex) + 64;
  // Planning with FFTW_MEASURE overwrites its arrays: plan on scratch with the caller's
  // alignment class so that the plan is valid for the caller's arrays later.
  Scratch in(bytes);
  Scratch out(key.inPlace ? 0 : bytes);
  if (!in.p || (!key.inPlace && !out.p)) return;
  auto* pin = reinterpret_cast<fftwf_complex*>(in.p + key.alignIn);
  auto* pout = key.inPlace ? pin : reinterpret_cast<fftwf_complex*>(out.p + key.alignOut);
  int n = s.n;
  std::lock_guard lock(planner_mutex());
  fftwf_plan_with_nthreads(key.threads);
  plan_ = fftwf_plan_many_dft(1, &n, s.howmany, pin, nullptr, s.stride, s.dist, pout, nullptr, s.stride, s.dist,
                              s.sign, key.flags);
}

FftwPlan::~FftwPlan() {
  if (!plan_) return;
  std::lock_guard lock(planner_mutex());
  fftwf_destroy_plan(plan_);
}

void FftwPlan::execute(const fcomplex* in, fcomplex* out) const {
  // c2c out-of-place plans preserve their input (FFTW's default), so the cast is sound.
  fftwf_execute_dft(plan_, reinterpret_cast<fftwf_complex*>(const_cast<fcomplex*>(in)),
                    reinterpret_cast<fftwf_complex*>(out));
}

std::shared_ptr<const FftwPlan> cached_plan(const PlanKey& key) {
  PlanCache& c = cache();
  {
    std::lock_guard lock(planner_mutex());
    auto it = c.plans.find(key);
    if (it != c.plans.end()) return it->second;
  }
  // Planned outside the cache lock's scope; FftwPlan takes the planner lock itself. Two
  // threads planning the same key both plan, and the first to insert wins.
  auto plan = std::make_shared<const FftwPlan>(key);
  if (!plan->valid()) return nullptr;
  std::lock_guard lock(planner_mutex());
  auto [it, inserted] = c.plans.emplace(key, plan);
  return it->second;
}

std::size_t cached_plan_count() {
  PlanCache& c = cache();
  std::lock_guard lock(planner_mutex());
  return c.plans.size();
}

void clear_plan_cache() {
  std::map<PlanKey, std::shared_ptr<const FftwPlan>> old;
  {
    std::lock_guard lock(planner_mutex());
    old.swap(cache().plans);
  }
  // `old` dies here, outside the lock: each plan's destructor takes the lock itself.
}

std::shared_ptr<const Stage> Stage::make(const BatchShape& shape, bool inPlace) {
  if (shape.n < 1 || shape.howmany < 1 || shape.stride < 1 || shape.dist < 1) return nullptr;
  int chunk = shape.howmany;
  const std::int64_t perChunk = kChunkSamples / shape.n;
  if (perChunk < shape.howmany) {
    chunk = static_cast<int>(std::max<std::int64_t>(kChunkQuantum, perChunk / kChunkQuantum * kChunkQuantum));
    chunk = std::min(chunk, shape.howmany);
  }
  auto stage = std::make_shared<Stage>(shape, chunk);
  const int threads = engine_threads();
  if (stage->turned() || stage->rows()) {
    // One plan of a single transform, run once per row: FFTW's estimate for a batch of long
    // transforms is often much slower than its plan for one transform run in a loop.
    const PlanKey key = stage->turned() ? stage->turned_key(threads) : stage->row_key(inPlace, 0, 0, threads);
    auto one = cached_plan(key);
    if (!one) return nullptr;
    stage->warm_.push_back(std::move(one));
    stage->warmKeys_.push_back(key);
    return stage;
  }
  const PlanKey fullKey = stage->key_for(chunk, inPlace, 0, 0, threads);
  auto full = cached_plan(fullKey);
  if (!full) return nullptr;
  stage->warm_.push_back(std::move(full));
  stage->warmKeys_.push_back(fullKey);
  if (const int rest = shape.howmany % chunk; rest != 0) {
    const PlanKey tailKey = stage->key_for(rest, inPlace, 0, 0, threads);
    auto tail = cached_plan(tailKey);
    if (!tail) return nullptr;
    stage->warm_.push_back(std::move(tail));
    stage->warmKeys_.push_back(tailKey);
  }
  return stage;
}

int Stage::planner_threads_for(int /*threads*/) const {
  // Never let FFTW split a transform over its own threads: the split depends on the thread
  // count and changes the rounding, so one and two threads would give other bytes. The kit
  // runs whole chunks on its threads instead, each chunk through the same single-threaded plan.
  return 1;
}

namespace {

// The key of a plan of `shape`: an in-place plan has one alignment for both sides.
PlanKey key_of(const BatchShape& shape, bool inPlace, int alignIn, int alignOut, int plannerThreads) {
  PlanKey k;
  k.shape = shape;
  k.inPlace = inPlace;
  k.alignIn = alignIn;
  k.alignOut = inPlace ? alignIn : alignOut;
  k.threads = plannerThreads;
  k.flags = planner_flags();
  return k;
}

}  // namespace

PlanKey Stage::key_for(int howmany, bool inPlace, int alignIn, int alignOut, int threads) const {
  BatchShape shape = shape_;
  shape.howmany = howmany;
  return key_of(shape, inPlace, alignIn, alignOut, planner_threads_for(threads));
}

PlanKey Stage::turned_key(int threads) const {
  // The turning buffer is the kit's own, 64-byte aligned: one row in place.
  return row_key(true, 0, 0, threads);
}

PlanKey Stage::row_key(bool inPlace, int alignIn, int alignOut, int threads) const {
  return key_of(BatchShape{shape_.n, 1, 1, shape_.n, shape_.sign}, inPlace, alignIn, alignOut,
                planner_threads_for(threads));
}

std::shared_ptr<const FftwPlan> Stage::single_plan(const PlanKey& key) const {
  if (!warmKeys_.empty() && warmKeys_[0] == key) return warm_[0];
  return cached_plan(key);
}

void Stage::run_rows(const fcomplex* in, fcomplex* out, double scale) const {
  const bool inPlace = in == out;
  const int threads = engine_threads();
  const int chunks = (shape_.howmany + chunk_ - 1) / chunk_;
  const std::int64_t samples = static_cast<std::int64_t>(shape_.n) * shape_.howmany;
  const int workers = (chunks > 1 && samples >= kParallelSamples) ? threads : 1;
  base::ParallelFailure failure;
  parallel_for(chunks, workers, [&](int c) { failure.run([&] {
    const int first = c * chunk_;
    const int count = std::min(chunk_, shape_.howmany - first);
    // Rows of one pitch share their alignment class; the plan is looked up again only when
    // the class changes from one row to the next.
    std::shared_ptr<const FftwPlan> plan;
    int lastIn = -1, lastOut = -1;
    for (int t = 0; t < count; ++t) {
      const std::int64_t offset = static_cast<std::int64_t>(first + t) * shape_.dist;
      const int ai = alignment_of(in + offset), ao = alignment_of(out + offset);
      if (!plan || ai != lastIn || ao != lastOut) {
        plan = single_plan(row_key(inPlace, ai, ao, threads));
        if (!plan) throw std::runtime_error("fft: the engine refused a row transform");
        lastIn = ai;
        lastOut = ao;
      }
      plan->execute(in + offset, out + offset);
      if (scale != 1.0) scale_samples(out + offset, shape_.n, scale);
    }
  }); });
  failure.rethrow();
}

namespace {

// Turning buffer of one thread, kept from call to call.
fcomplex* turning_buffer(std::size_t samples) {
  struct Buffer {
    fcomplex* p = nullptr;
    std::size_t size = 0;
    ~Buffer() { fftwf_free(p); }
  };
  thread_local Buffer b;
  if (b.size < samples) {
    fftwf_free(b.p);
    b.p = static_cast<fcomplex*>(fftwf_malloc(samples * sizeof(fcomplex)));
    b.size = b.p ? samples : 0;
  }
  return b.p;
}

// t[k n + l] = src[l stride + k] for k < count, l < n.
void gather_columns_base(const fcomplex* src, std::int64_t stride, int n, int count, fcomplex* t) {
  for (int l0 = 0; l0 < n; l0 += kTurnTileRows) {
    const int l1 = std::min(n, l0 + kTurnTileRows);
    for (int k = 0; k < count; ++k) {
      fcomplex* dst = t + static_cast<std::int64_t>(k) * n;
      for (int l = l0; l < l1; ++l) dst[l] = src[static_cast<std::int64_t>(l) * stride + k];
    }
  }
}

void scatter_columns_base(const fcomplex* t, int n, int count, fcomplex* dst, std::int64_t stride) {
  for (int l0 = 0; l0 < n; l0 += kTurnTileRows) {
    const int l1 = std::min(n, l0 + kTurnTileRows);
    for (int l = l0; l < l1; ++l) {
      fcomplex* row = dst + static_cast<std::int64_t>(l) * stride;
      for (int k = 0; k < count; ++k) row[k] = t[static_cast<std::int64_t>(k) * n + l];
    }
  }
}

struct Turns {
  void (*gather)(const fcomplex*, std::int64_t, int, int, fcomplex*);
  void (*scatter)(const fcomplex*, int, int, fcomplex*, std::int64_t);
};

const Turns& turns() {
  static const Turns chosen = [] {
    __builtin_cpu_init();
    if (__builtin_cpu_supports("avx2") && __builtin_cpu_supports("fma"))
      return Turns{gather_columns_avx2, scatter_columns_avx2};
    return Turns{gather_columns_base, scatter_columns_base};
  }();
  return chosen;
}

void gather_columns(const fcomplex* src, std::int64_t stride, int n, int count, fcomplex* t) {
  turns().gather(src, stride, n, count, t);
}

void scatter_columns(const fcomplex* t, int n, int count, fcomplex* dst, std::int64_t stride) {
  turns().scatter(t, n, count, dst, stride);
}

}  // namespace

void Stage::run_turned(const fcomplex* in, fcomplex* out, double scale) const {
  const int threads = engine_threads();
  const int chunks = (shape_.howmany + chunk_ - 1) / chunk_;
  const auto one = single_plan(turned_key(threads));
  if (!one) return;
  const std::int64_t samples = static_cast<std::int64_t>(shape_.n) * shape_.howmany;
  const int workers = (chunks > 1 && samples >= kParallelSamples) ? threads : 1;
  const std::size_t need = static_cast<std::size_t>(shape_.n) * static_cast<std::size_t>(chunk_);
  base::ParallelFailure failure;
  parallel_for(chunks, workers, [&](int c) { failure.run([&] {
    fcomplex* t = turning_buffer(need);
    if (!t) throw std::bad_alloc();
    const std::int64_t offset = static_cast<std::int64_t>(chunk_) * c;
    const int count = std::min(chunk_, shape_.howmany - chunk_ * c);
    gather_columns(in + offset, shape_.stride, shape_.n, count, t);
    // Every turned row starts on a 64-byte boundary when n is a multiple of 8; otherwise the
    // rows fall into other alignment classes and take their own plans.
    std::shared_ptr<const FftwPlan> plan = one;
    int last = 0;
    for (int k = 0; k < count; ++k) {
      fcomplex* row = t + static_cast<std::int64_t>(k) * shape_.n;
      const int a = alignment_of(row);
      if (a != last) {
        PlanKey key = turned_key(threads);
        key.alignIn = key.alignOut = a;
        plan = cached_plan(key);
        if (!plan) throw std::runtime_error("fft: the engine refused a column transform");
        last = a;
      } else if (a == 0) {
        plan = one;
      }
      plan->execute(row, row);
    }
    if (scale != 1.0) scale_samples(t, static_cast<std::int64_t>(shape_.n) * count, scale);
    scatter_columns(t, shape_.n, count, out + offset, shape_.stride);
  }); });
  failure.rethrow();
}

void Stage::run(const fcomplex* in, fcomplex* out, double scale) const {
  if (turned()) {
    run_turned(in, out, scale);
    return;
  }
  if (rows()) {
    run_rows(in, out, scale);
    return;
  }
  const bool inPlace = in == out;
  const int ai = alignment_of(in);
  const int ao = alignment_of(out);
  const int threads = engine_threads();
  const int chunks = (shape_.howmany + chunk_ - 1) / chunk_;
  const int rest = shape_.howmany % chunk_;
  auto plan_for = [&](int howmany, std::size_t warm) {
    const PlanKey key = key_for(howmany, inPlace, ai, ao, threads);
    if (warm < warmKeys_.size() && warmKeys_[warm] == key) return warm_[warm];
    return cached_plan(key);
  };
  auto full = plan_for(chunk_, 0);
  auto tail = rest != 0 ? plan_for(rest, 1) : nullptr;
  if (!full || (rest != 0 && !tail)) return;

  const std::int64_t samples = static_cast<std::int64_t>(shape_.n) * shape_.howmany;
  const int workers = (chunks > 1 && samples >= kParallelSamples) ? threads : 1;
  const std::int64_t step = static_cast<std::int64_t>(chunk_) * shape_.dist;
  parallel_for(chunks, workers, [&](int c) {
    const std::int64_t offset = step * c;
    const bool last = c == chunks - 1 && rest != 0;
    const int count = last ? rest : chunk_;
    (last ? *tail : *full).execute(in + offset, out + offset);
    if (scale == 1.0) return;
    fcomplex* base = out + offset;
    if (shape_.stride == 1) {
      for (int t = 0; t < count; ++t) scale_samples(base + static_cast<std::int64_t>(t) * shape_.dist, shape_.n, scale);
    } else if (shape_.dist == 1) {
      for (int e = 0; e < shape_.n; ++e) scale_samples(base + static_cast<std::int64_t>(e) * shape_.stride, count, scale);
    } else {
      for (int t = 0; t < count; ++t)
        for (int e = 0; e < shape_.n; ++e)
          scale_samples(base + static_cast<std::int64_t>(t) * shape_.dist + static_cast<std::int64_t>(e) * shape_.stride,
                        1, scale);
    }
  });
}

}  // namespace sar::dsp::detail

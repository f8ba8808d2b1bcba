#include "dsp/fft.hpp"

#include <sys/mman.h>

#include <algorithm>
#include <climits>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <functional>
#include <stdexcept>
#include <string>

#include "base/diagnostics.hpp"
#include "dsp/detail/fft_engine.hpp"

namespace sar::dsp {
namespace {

constexpr std::size_t kAlignment = 64;
constexpr std::size_t kHugePage = std::size_t{2} << 20;

struct Direction {
  bool known = false;
  int sign = FFTW_FORWARD;
  int scale = 0;
  int mapped = 0;
};

// 1 forward; -1 backward normalised; -2 backward unnormalised (kept as -1 without scale).
Direction map_direction(int code) {
  switch (code) {
    case 1: return {true, FFTW_FORWARD, 0, 1};
    case -1: return {true, FFTW_BACKWARD, 1, -1};
    case -2: return {true, FFTW_BACKWARD, 0, -1};
    default: return {};
  }
}

[[noreturn]] void throw_short(const char* what, const char* which, std::size_t have, std::int64_t need) {
  char msg[256];
  std::snprintf(msg, sizeof msg, "%s: %s holds %zu samples, the plan needs %lld", what, which, have,
                static_cast<long long>(need));
  throw std::length_error(msg);
}

bool overlap(const fcomplex* a, const fcomplex* b, std::int64_t n) {
  std::less<const fcomplex*> lt;
  return lt(a, b + n) && lt(b, a + n);
}

bool is_smooth(std::int64_t m) {
  for (int f : {2, 3, 5})
    while (m % f == 0) m /= f;
  return m == 1;
}

}  // namespace

std::int64_t fft_plan::extent() const {
  if (rowLength < 1 || colLength < 1) return 0;
  return static_cast<std::int64_t>(colLength - 1) * rowPitch + rowLength;
}

int fft_makep_c(fft_plan& plan, int pitch, int length, int rows, int count, int rowDirection, int colDirection,
                int inPlace) {
  plan = fft_plan{};
  if (pitch < 1 || rows < 1) return 1;
  if (length > pitch) return 2;
  if (count > rows) return 3;

  fft_plan p;
  p.rowPitch = pitch;
  p.rowLength = length;
  p.rowCapacity = rows;
  p.colLength = count;
  p.inPlace = inPlace != 0 ? 1 : 0;

  if (rowDirection != 0 && length != 1) {
    const Direction d = map_direction(rowDirection);
    if (!d.known) return 4;
    p.rowStage = detail::Stage::make({length, count, 1, pitch, d.sign}, p.inPlace != 0);
    if (!p.rowStage) return 4;
    p.rowDirection = d.mapped;
    p.rowScale = d.scale;
  }
  if (colDirection != 0 && count != 1) {
    const Direction d = map_direction(colDirection);
    if (!d.known) return 5;
    // After a row stage the columns are transformed in the output, in place.
    const bool colInPlace = p.inPlace != 0 || p.rowStage != nullptr;
    p.colStage = detail::Stage::make({count, length, pitch, 1, d.sign}, colInPlace);
    if (!p.colStage) return 5;
    p.colDirection = d.mapped;
    p.colScale = d.scale;
  }
  plan = std::move(p);
  return 0;
}

namespace {
int run_plan(const fft_plan& plan, std::span<const fcomplex> input, std::span<fcomplex> output, double gain) {
  if (!plan.rowStage && !plan.colStage) return 0;
  const std::int64_t need = plan.extent();
  if (static_cast<std::int64_t>(input.size()) < need) throw_short("pfft_c", "input", input.size(), need);
  if (static_cast<std::int64_t>(output.size()) < need) throw_short("pfft_c", "output", output.size(), need);
  const fcomplex* in = input.data();
  fcomplex* out = output.data();
  if (in != out && overlap(in, out, need))
    throw std::invalid_argument("pfft_c: input and output overlap without being the same buffer");

  const double factor =
      (plan.rowScale ? 1.0 / plan.rowLength : 1.0) * (plan.colScale ? 1.0 / plan.colLength : 1.0) * gain;
  if (plan.rowStage) plan.rowStage->run(in, out, plan.colStage ? 1.0 : factor);
  if (plan.colStage) plan.colStage->run(plan.rowStage ? out : in, out, factor);
  return 0;
}
}  // namespace

int pfft_c(const fft_plan& plan, std::span<const fcomplex> input, std::span<fcomplex> output) {
  return run_plan(plan, input, output, 1.0);
}

int pfft_c(const fft_plan& plan, std::span<fcomplex> data) { return pfft_c(plan, data, data); }

int pfft_c(const fft_plan& plan, std::span<fcomplex> data, double gain) {
  return run_plan(plan, data, data, gain);
}

int fft_destp_c(fft_plan& plan) {
  plan = fft_plan{};
  return 0;
}

int fft_c(int pitch, int length, int rows, int count, int rowDirection, int colDirection,
          std::span<const fcomplex> input, std::span<fcomplex> output) {
  fft_plan plan;
  const int inPlace = input.data() == output.data() ? 1 : 0;
  if (int st = fft_makep_c(plan, pitch, length, rows, count, rowDirection, colDirection, inPlace)) return st;
  return pfft_c(plan, input, output);
}

int fft_c(int pitch, int length, int rows, int count, int rowDirection, int colDirection, std::span<fcomplex> data) {
  return fft_c(pitch, length, rows, count, rowDirection, colDirection, data, data);
}

int genpow(int n, int step) {
  if (n <= 0) return 0;
  const std::int64_t s = std::max(step, 1);
  std::int64_t m = n;
  while (m <= INT_MAX) {
    if (is_smooth(m)) {
      // 5625 = 3^2 5^4 is avoided on purpose; the search goes on behind it.
      if (m != 5625) return static_cast<int>(m);
      m = 5626;
      continue;
    }
    m += s;
  }
  return 0;
}

namespace {
int rotate_rows(std::span<fcomplex> buf, int n, int rows, bool inverse, const char* what) {
  if (n < 1 || rows < 1) return 0;
  const std::int64_t need = static_cast<std::int64_t>(n) * rows;
  if (static_cast<std::int64_t>(buf.size()) < need) {
    char msg[160];
    std::snprintf(msg, sizeof msg, "%s: buffer holds %zu samples, %d rows of %d need %lld", what, buf.size(), rows, n,
                  static_cast<long long>(need));
    throw std::length_error(msg);
  }
  const bool even = n % 2 == 0;
  const int h = (n - 1) / 2;
  // Odd n: fftshift moves sample 0 to h, i.e. rotates left by h + 1; ifftshift by h.
  const int shift = even ? n / 2 : (inverse ? h : h + 1);
  for (int r = 0; r < rows; ++r) {
    auto row = buf.begin() + static_cast<std::ptrdiff_t>(r) * n;
    std::rotate(row, row + shift, row + n);
  }
  return 0;
}
}  // namespace

int fftshift(std::span<fcomplex> buf, int n, int rows) { return rotate_rows(buf, n, rows, false, "fftshift"); }

int ifftshift(std::span<fcomplex> buf, int n, int rows) { return rotate_rows(buf, n, rows, true, "ifftshift"); }

void* fft_malloc(std::size_t bytes) {
  if (bytes > static_cast<std::size_t>(-1) - kHugePage) return nullptr;
  if (bytes >= kHugePage) {
    // Scene-sized buffers: aligned to and advised for huge pages, so that first touching a
    // gigabyte costs a few hundred page faults instead of a few hundred thousand.
    const std::size_t rounded = (bytes + kHugePage - 1) / kHugePage * kHugePage;
    void* p = std::aligned_alloc(kHugePage, rounded);
    if (p) {
      // Advice only: where the system has no huge pages it fails, which changes nothing and
      // must not leave an errno for the callers' frames to report.
      const base::ErrnoGuard keep;
      ::madvise(p, rounded, MADV_HUGEPAGE);
    }
    return p;
  }
  const std::size_t rounded = std::max<std::size_t>(1, (bytes + kAlignment - 1) / kAlignment) * kAlignment;
  return std::aligned_alloc(kAlignment, rounded);
}

void* fft_calloc(std::size_t count, std::size_t size) {
  if (size != 0 && count > static_cast<std::size_t>(-1) / size) return nullptr;
  void* p = fft_malloc(count * size);
  if (p) std::memset(p, 0, count * size);
  return p;
}

void fft_free(void* p) { std::free(p); }

void set_fft_threads(int threads) { detail::set_engine_threads(threads); }

int fft_threads() { return detail::engine_threads(); }

void set_fft_planning(FftPlanning planning) {
  switch (planning) {
    case FftPlanning::Estimate: detail::set_planner_flags(FFTW_ESTIMATE); break;
    case FftPlanning::Measure: detail::set_planner_flags(FFTW_MEASURE); break;
    case FftPlanning::Patient: detail::set_planner_flags(FFTW_PATIENT); break;
  }
}

FftPlanning fft_planning() {
  const unsigned f = detail::planner_flags();
  if (f == FFTW_ESTIMATE) return FftPlanning::Estimate;
  if (f == FFTW_PATIENT) return FftPlanning::Patient;
  return FftPlanning::Measure;
}

std::size_t fft_cached_plans() { return detail::cached_plan_count(); }

void fft_clear_cache() { detail::clear_plan_cache(); }

}  // namespace sar::dsp

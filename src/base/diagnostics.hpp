#pragma once
// Call frames, tracked memory and numbered reports.
//
// Every processing function runs inside a Frame: it raises the call depth, records the
// function's name and its call-graph coordinate, and lets a failing function free what it and
// its callees allocated through the tracked allocator. Reports go to the trace and log of the
// run services by level; some levels end the run.
//
// The layer is process-wide and single-threaded by design: frames and reports belong to the
// job's main thread, never to worker threads of a parallel loop.
#include <cerrno>
#include <cstddef>
#include <cstdint>
#include "base/source_location.hpp"
#include <string>
#include <string_view>
#include <type_traits>
#include <utility>

namespace sar::base {

/// printf-style text of any length, for report messages.
std::string format_text(const char* format, ...) __attribute__((format(printf, 1, 2)));

/// Report levels.
enum ReportLevel : int {
  kReportError = 0,
  kReportWarning = 1,
  kReportCheckpoint = 2,
  kReportErrorCallTree = 3,
  kReportCorrectFunctionCall = 4,
  kReportCorrectSystemCall = 5,
  kReportMessage = 6,
  kReportXcaMissing = 7,
  kReportXchMissing = 8,
  kReportDorvorMissing = 9,
  kReportInsMissing = 10,
  kReportDemNotCovering = 11,
  kReportDemMissing = 12,
  kReportImageMissing = 13,
  kReportBurstSync = 19,
  kReportOverlap = 20,
  kReportFileIo = 21,
};

/// Word shown for a level in the trace ("ERROR", "WARNING", ..., "UNKNOWN").
std::string_view report_level_word(int level);

/// Text of the report that a failing call leaves at level 3.
inline constexpr std::string_view kCalledFunctionError = "Called function returned ERROR";

/// Unit name under which the diagnostics layer raises its fatal exits.
inline constexpr std::string_view kCheckerrUnit = "libsrc/sources/checkerrlib/checkerr_kelvor";

int init_ckerr_locking();
int ckflg_ckerr();
int ckflg_report();
void set_flg_report(int value);

void set_ckerr_fun(std::string_view name);
void deccurdep();
int current_depth();

void* malloc_ckerr(std::size_t size);
void* calloc_ckerr(std::size_t count, std::size_t size);
void free_ckerr(void* pointer);
void freeall_ckerr();
void** matalloc_ckerr(int rows, std::size_t rowBytes);
void matfree_ckerr(void** matrix, int rows);
/// Number of live tracked buffers.
int ckerr_buffer_count();

void init_report(int reserved, std::string_view label, int level);
void exit_report();
/// Ends a successful run: reports leaks on the error stream, resets the layer, FinishRun(0,1,1).
void exit_ckerr();
/// Number of reports made that did not end the run.
int report_count();

void omb_check(int errorNumber, int line, std::string_view file, std::string_view function);
void omb_add_report(std::string_view text, int level, int line, std::string_view file, std::string_view function);

/// Report with the caller's source location as line and file.
void report(int level, std::string_view text, source_location loc = source_location::current());

/// Dump a buffer: three int32 (type, dim1, dim2) in machine order, then the data.
/// Type sizes: 0: 4 bytes, 1: 8, 2: 8, 3: 16, 4: 2.
int write_debug(const std::string& path, const void* data, int type, int dim1, int dim2);

/// Keeps errno as the caller left it across calls whose failure is expected (a probe for a file
/// that may be absent, an advice the system may refuse): the next frame would report it.
class ErrnoGuard {
 public:
  ErrnoGuard() : saved_(errno) {}
  ~ErrnoGuard() { errno = saved_; }
  ErrnoGuard(const ErrnoGuard&) = delete;
  ErrnoGuard& operator=(const ErrnoGuard&) = delete;

 private:
  int saved_;
};

/// The function frame as a scope guard. Entering checks and clears errno and pushes the name;
/// leaving pops the depth. A failing callee is passed through `check`:
///
///   Frame frame("rangefoc");
///   if (int st = frame.check(init_buffer(par, proc))) return st;
///
/// `check` reports "Called function returned ERROR" at level 3 with the caller's line and, on a
/// non-zero status, frees what this invocation allocated through the tracked allocator.
class Frame {
 public:
  explicit Frame(std::string_view name, source_location loc = source_location::current());
  ~Frame();
  Frame(const Frame&) = delete;
  Frame& operator=(const Frame&) = delete;

  int check(int status, source_location loc = source_location::current());
  /// errno test at a system call boundary: a non-zero errno is reported at level 0 and cleared.
  void check_errno(source_location loc = source_location::current()) const;

 private:
  std::string file_;
};

/// Memory taken through the tracked allocator and given back when the owner goes out of scope.
/// A buffer released earlier by freeall_ckerr is not freed twice: ownership is by allocation
/// serial, not by address.
template <class T>
class CheckedBuffer {
 public:
  CheckedBuffer() = default;
  explicit CheckedBuffer(std::size_t count);
  ~CheckedBuffer() { reset(); }
  CheckedBuffer(CheckedBuffer&& o) noexcept
      : data_(std::exchange(o.data_, nullptr)), size_(std::exchange(o.size_, 0)), serial_(std::exchange(o.serial_, 0)) {}
  CheckedBuffer& operator=(CheckedBuffer&& o) noexcept {
    if (this != &o) {
      reset();
      data_ = std::exchange(o.data_, nullptr);
      size_ = std::exchange(o.size_, 0);
      serial_ = std::exchange(o.serial_, 0);
    }
    return *this;
  }
  CheckedBuffer(const CheckedBuffer&) = delete;
  CheckedBuffer& operator=(const CheckedBuffer&) = delete;

  T* data() { return data_; }
  const T* data() const { return data_; }
  std::size_t size() const { return size_; }
  T& operator[](std::size_t i) { return data_[i]; }
  const T& operator[](std::size_t i) const { return data_[i]; }
  T* begin() { return data_; }
  T* end() { return data_ + size_; }
  explicit operator bool() const { return data_ != nullptr; }
  void reset();

 private:
  T* data_ = nullptr;
  std::size_t size_ = 0;
  uint64_t serial_ = 0;
};

namespace detail {
/// Tracked zeroed allocation returning its serial; null on exhaustion (also tracked, as null).
void* tracked_alloc(std::size_t bytes, uint64_t& serial);
/// Free by serial if the allocation is still tracked; no effect otherwise.
void tracked_release(uint64_t serial);
}  // namespace detail

template <class T>
CheckedBuffer<T>::CheckedBuffer(std::size_t count) : size_(count) {
  static_assert(std::is_trivially_copyable_v<T>, "tracked buffers hold plain samples");
  data_ = static_cast<T*>(detail::tracked_alloc(count * sizeof(T), serial_));
  if (!data_) size_ = 0;
}

template <class T>
void CheckedBuffer<T>::reset() {
  if (serial_ != 0) detail::tracked_release(serial_);
  data_ = nullptr;
  size_ = 0;
  serial_ = 0;
}

}  // namespace sar::base

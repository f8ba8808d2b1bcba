#pragma once
// Carries the first exception thrown inside an OpenMP region out of it. An exception may not
// leave a region: the runtime would end the process on the spot, with no error record for the
// host and half-written files left behind. Run each iteration's body through run(), then call
// rethrow() after the region; once one body has failed the others are skipped.
#include <atomic>
#include <exception>
#include <mutex>

namespace sar::base {

class ParallelFailure {
 public:
  template <class F>
  void run(F&& body) noexcept {
    if (failed_.load(std::memory_order_relaxed)) return;
    try {
      body();
    } catch (...) {
      std::lock_guard lock(mutex_);
      if (!error_) error_ = std::current_exception();
      failed_.store(true, std::memory_order_relaxed);
    }
  }
  bool failed() const { return failed_.load(std::memory_order_relaxed); }
  /// After the region: throws the first exception a body threw, if any.
  void rethrow() const {
    if (error_) std::rethrow_exception(error_);
  }

 private:
  std::atomic<bool> failed_{false};
  std::mutex mutex_;
  std::exception_ptr error_;
};

}  // namespace sar::base

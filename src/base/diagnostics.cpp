#include "base/diagnostics.hpp"

#include <algorithm>
#include <cstdarg>
#include <array>
#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <fstream>
#include <string>
#include <vector>

#include "base/errors.hpp"
#include "base/run_services.hpp"

namespace sar::base {
namespace {

constexpr int kMaxDepth = 64;
constexpr std::size_t kAlignment = 64;

struct TrackedBuffer {
  void* pointer = nullptr;
  uint64_t serial = 0;
  std::array<uint16_t, kMaxDepth> coordinate{};
  std::string function;
  int depth = 0;
};

struct CheckState {
  int checking = 0;
  int reportFlag = 0;
  int depth = 0;
  std::array<uint16_t, kMaxDepth> coordinate{};
  std::array<std::string, kMaxDepth> names{};
  std::vector<TrackedBuffer> buffers;
  int reports = 0;
  uint64_t nextSerial = 1;
};

CheckState& state() {
  static CheckState s;
  return s;
}

void* aligned_zeroed(std::size_t bytes) {
  const std::size_t rounded = ((bytes ? bytes : 1) + kAlignment - 1) / kAlignment * kAlignment;
  void* p = std::aligned_alloc(kAlignment, rounded);
  if (p) std::memset(p, 0, rounded);
  return p;
}

bool same_invocation(const TrackedBuffer& b, const CheckState& s) {
  for (int d = 1; d <= s.depth && d < kMaxDepth; ++d)
    if (b.coordinate[d] != s.coordinate[d]) return false;
  return true;
}

void* track(void* p, uint64_t& serial) {
  CheckState& s = state();
  serial = 0;
  if (!s.checking) return p;
  TrackedBuffer b;
  b.pointer = p;
  b.serial = serial = s.nextSerial++;
  b.coordinate = s.coordinate;
  const int d = std::clamp(s.depth, 0, kMaxDepth - 1);
  b.function = s.names[d];
  b.depth = d;
  s.buffers.push_back(std::move(b));
  return p;
}

void remove_at(std::size_t i) {
  CheckState& s = state();
  std::free(s.buffers[i].pointer);
  // The table is not kept in order: the last entry takes the freed slot.
  if (i + 1 != s.buffers.size()) s.buffers[i] = std::move(s.buffers.back());
  s.buffers.pop_back();
}

}  // namespace

std::string_view report_level_word(int level) {
  switch (level) {
    case 0: return "ERROR";
    case 1: return "WARNING";
    case 2: return "CHECKPOINT";
    case 3: return "ERROR_CALL_TREE";
    case 4: return "CORRECT_FUNCTION_CALL";
    case 5: return "CORRECT_SYSTEM_CALL";
    case 6: return "MESSAGE";
    case 7: return "XCA DOES NOT EXIST";
    case 8: return "XCH DOES NOT EXIST";
    case 9: return "DORVOR DOES NOT EXIST";
    case 10: return "INS DOES NOT EXIST";
    case 11: return "DEM DOES NOT COVER WHOLE IMAGE";
    case 12: return "DEM DOES NOT EXIST";
    case 13: return "IMAGE DOES NOT EXIST";
    case 19: return "BURST SYNC ERROR";
    case 20: return "OVERLAP ERROR";
    case 21: return "FILE I/O ERROR";
    default: return "UNKNOWN";
  }
}

int init_ckerr_locking() {
  CheckState& s = state();
  if (s.checking) return 0;
  s.checking = 1;
  s.coordinate.fill(0);
  for (auto& b : s.buffers) std::free(b.pointer);
  s.buffers.clear();
  s.depth = 0;
  s.names.fill(std::string());
  s.names[0] = "main()";
  return 0;
}

int ckflg_ckerr() { return state().checking; }
int ckflg_report() { return state().reportFlag; }
void set_flg_report(int value) { state().reportFlag = value; }
int current_depth() { return state().depth; }

void set_ckerr_fun(std::string_view name) {
  CheckState& s = state();
  if (!s.checking) return;
  ++s.depth;
  if (s.depth >= kMaxDepth) {
    // A call chain this deep means runaway recursion, never a real job: stop with a diagnostic.
    s.depth = kMaxDepth - 1;
    fatal(ec::kUncaught, {"call depth above 64"});
  }
  ++s.coordinate[s.depth];
  s.names[s.depth] = std::string(name.substr(0, 127));
}

void deccurdep() { --state().depth; }

void* malloc_ckerr(std::size_t size) {
  uint64_t serial;
  return track(aligned_zeroed(size), serial);
}

void* calloc_ckerr(std::size_t count, std::size_t size) {
  uint64_t serial;
  if (size != 0 && count > SIZE_MAX / size) return track(nullptr, serial);
  return track(aligned_zeroed(count * size), serial);
}

void free_ckerr(void* pointer) {
  CheckState& s = state();
  if (!s.checking) {
    std::free(pointer);
    return;
  }
  if (!pointer) return;
  for (std::size_t i = 0; i < s.buffers.size(); ++i) {
    if (s.buffers[i].pointer == pointer) {
      remove_at(i);
      return;
    }
  }
  // An untracked pointer is left alone: it may belong to another allocator.
}

void freeall_ckerr() {
  CheckState& s = state();
  if (!s.checking) return;
  for (std::size_t i = 0; i < s.buffers.size();) {
    if (same_invocation(s.buffers[i], s)) {
      remove_at(i);
      i = 0;  // the moved-in entry must be examined too
    } else {
      ++i;
    }
  }
}

void** matalloc_ckerr(int rows, std::size_t rowBytes) {
  auto** matrix = static_cast<void**>(malloc_ckerr(sizeof(void*) * static_cast<std::size_t>(rows > 0 ? rows : 0)));
  if (!matrix || rows < 1) return matrix;
  for (int r = 0; r < rows; ++r) {
    matrix[r] = calloc_ckerr(1, rowBytes);
    if (!matrix[r]) return nullptr;
  }
  return matrix;
}

void matfree_ckerr(void** matrix, int rows) {
  if (!matrix) return;
  for (int r = 0; r < rows; ++r) free_ckerr(matrix[r]);
  free_ckerr(matrix);
}

int ckerr_buffer_count() { return static_cast<int>(state().buffers.size()); }

namespace detail {
void* tracked_alloc(std::size_t bytes, uint64_t& serial) {
  void* p = aligned_zeroed(bytes);
  if (!state().checking) {
    // Without the tracking table the owner still needs a handle to free by.
    serial = 0;
    return p;
  }
  return track(p, serial);
}

void tracked_release(uint64_t serial) {
  CheckState& s = state();
  for (std::size_t i = 0; i < s.buffers.size(); ++i) {
    if (s.buffers[i].serial == serial) {
      remove_at(i);
      return;
    }
  }
}
}  // namespace detail

void init_report(int /*reserved*/, std::string_view /*label*/, int level) {
  CheckState& s = state();
  if (s.reportFlag >= 1 && s.reportFlag <= 3) return;
  if (!s.checking) return;
  if (level >= 1 && level <= 3) {
    s.reportFlag = level;
    s.reports = 0;
  } else {
    s.reportFlag = 0;
  }
}

void exit_report() {}

int report_count() { return state().reports; }

void exit_ckerr() {
  CheckState& s = state();
  if (!s.checking) return;
  if (!s.buffers.empty()) {
    std::fprintf(stderr, "\nPotential memory leaks detected!\n");
    std::fprintf(stderr, "\n%d buffers left to be de-allocated.!\n", static_cast<int>(s.buffers.size()));
    std::fprintf(stderr, "--------------------------------\n");
    std::fprintf(stderr, "ML call graph coordinates: \n");
    for (const auto& b : s.buffers) {
      std::fprintf(stderr, "%s : ", b.function.c_str());
      for (int d = 0; d <= b.depth; ++d) std::fprintf(stderr, "%d\t", b.coordinate[d]);
      std::fprintf(stderr, "\n");
    }
  }
  // Leaks are reported, not an error; the buffers stay with the process.
  s.coordinate.fill(0);
  s.buffers.clear();
  s.checking = 0;
  s.depth = 0;
  s.reports = 0;
}

void omb_check(int errorNumber, int line, std::string_view file, std::string_view function) {
  if (errorNumber == 0) return;
  omb_add_report(std::strerror(errorNumber), kReportError, line, file, function);
}

void omb_add_report(std::string_view text, int level, int line, std::string_view file, std::string_view function) {
  CheckState& s = state();
  if (s.reportFlag < 1 || s.reportFlag > 3) return;
  const std::string t(text), fl(file), fn(function);
  char full[2048];
  std::snprintf(full, sizeof full, "%s - line : %d - function : %s - file : %s", t.c_str(), line, fn.c_str(),
                fl.c_str());
  const std::string word(report_level_word(level));

  const bool traceLine = level == 0 || level == 1 || level == 2 || level == 6 || (level >= 7 && level <= 13) ||
                         (level >= 19 && level <= 21);
  const bool logLine = level == 0 || (level >= 7 && level <= 13) || (level >= 19 && level <= 21);
  if (traceLine) TracePrintf("Ombrix %s: %s\n", word.c_str(), full);
  if (logLine) LogPrintf("PROCESSING ERROR: %s - Ombrix\n", full);
  if (traceLine || logLine) flush_trace();

  int32_t code = 0;
  switch (level) {
    case 7: code = ec::kXcaMissing; break;
    case 8: code = ec::kXchMissing; break;
    case 9: code = ec::kDorvorMissing; break;
    case 10: code = ec::kInsMissing; break;
    case 11: code = ec::kDemNotCovering; break;
    case 12: code = ec::kDemMissing; break;
    case 13: code = ec::kImageMissing; break;
    case 19: code = ec::kBurstSync; break;
    case 20: code = ec::kOverlap; break;
    case 21: code = ec::kFileIo; break;
    default: break;
  }
  if (code != 0) fatal_at(code, {t}, std::string(kCheckerrUnit), line);
  ++s.reports;
}

void report(int level, std::string_view text, source_location loc) {
  omb_add_report(text, level, static_cast<int>(loc.line()), loc.file_name(), loc.file_name());
}

int write_debug(const std::string& path, const void* data, int type, int dim1, int dim2) {
  static constexpr int kTypeSize[] = {4, 8, 8, 16, 2};
  std::ofstream out(path, std::ios::binary | std::ios::trunc);
  const int32_t head[3] = {type, dim1, dim2};
  out.write(reinterpret_cast<const char*>(head), sizeof head);
  if (type >= 0 && type < 5 && dim1 > 0 && dim2 > 0 && data)
    out.write(static_cast<const char*>(data),
              static_cast<std::streamsize>(kTypeSize[type]) * static_cast<std::streamsize>(dim1) * dim2);
  return 0;
}

Frame::Frame(std::string_view name, source_location loc) : file_(loc.file_name()) {
  omb_check(errno, static_cast<int>(loc.line()), file_, file_);
  errno = 0;
  set_ckerr_fun(name);
}

Frame::~Frame() {
  if (ckflg_ckerr()) deccurdep();
}

int Frame::check(int status, source_location loc) {
  const int line = static_cast<int>(loc.line());
  if (status != 0) omb_add_report(kCalledFunctionError, kReportErrorCallTree, line, file_, file_);
  omb_check(errno, line, file_, file_);
  errno = 0;
  if (status != 0) freeall_ckerr();
  return status;
}

void Frame::check_errno(source_location loc) const {
  omb_check(errno, static_cast<int>(loc.line()), file_, file_);
  errno = 0;
}

std::string format_text(const char* format, ...) {
  va_list args;
  va_start(args, format);
  va_list copy;
  va_copy(copy, args);
  const int n = std::vsnprintf(nullptr, 0, format, copy);
  va_end(copy);
  std::string text;
  if (n > 0) {
    text.resize(static_cast<std::size_t>(n) + 1);
    std::vsnprintf(text.data(), text.size(), format, args);
    text.resize(static_cast<std::size_t>(n));
  }
  va_end(args);
  return text;
}


}  // namespace sar::base

#include "stripmap/raster_files.hpp"

#include <atomic>
#include <chrono>
#include <filesystem>
#include <system_error>

#include "base/errors.hpp"

namespace sar::stripmap {

namespace ec = base::ec;

void InputRaster::Closer::operator()(std::FILE* f) const {
  if (f) std::fclose(f);
}

InputRaster::InputRaster(const std::string& path, int64_t bytes, const char* what) : path_(path), what_(what) {
  std::error_code err;
  const auto size = std::filesystem::file_size(path, err);
  if (err) base::fatal(ec::kFileIo, {path, what_ + " cannot be opened"});
  if (static_cast<int64_t>(size) < bytes)
    base::fatal(ec::kFileIo, {path, what_ + " is shorter than the product needs",
                              std::to_string(size) + " of " + std::to_string(bytes) + " bytes"});
  file_.reset(std::fopen(path.c_str(), "rb"));
  if (!file_) base::fatal(ec::kFileIo, {path, what_ + " cannot be opened"});
}

void InputRaster::seek(int64_t offset) {
  if (fseeko(file_.get(), static_cast<off_t>(offset), SEEK_SET) != 0)
    base::fatal(ec::kFileIo, {path_, "seek failed in the " + what_});
}

void InputRaster::read(void* data, int64_t bytes) {
  if (bytes > 0 && std::fread(data, 1, static_cast<std::size_t>(bytes), file_.get()) != static_cast<std::size_t>(bytes))
    base::fatal(ec::kFileIo, {path_, "read failed in the " + what_});
}

void OutputRaster::Closer::operator()(std::FILE* f) const {
  if (f) std::fclose(f);
}

OutputRaster::OutputRaster(std::string path) : path_(std::move(path)), part_(path_ + ".part") {
  file_.reset(std::fopen(part_.c_str(), "wb"));
  if (!file_) base::fatal(ec::kFileIo, {path_, "output file cannot be created"});
}

OutputRaster::~OutputRaster() {
  if (!committed_) {
    file_.reset();
    std::error_code err;
    std::filesystem::remove(part_, err);
  }
}

namespace {
std::atomic<int64_t> writeNanoseconds{0};

// Adds the lifetime of the scope to the write clock.
struct WriteClock {
  std::chrono::steady_clock::time_point start = std::chrono::steady_clock::now();
  ~WriteClock() {
    writeNanoseconds += std::chrono::duration_cast<std::chrono::nanoseconds>(std::chrono::steady_clock::now() - start)
                            .count();
  }
};
}  // namespace

double output_write_seconds() { return static_cast<double>(writeNanoseconds.load()) * 1e-9; }

void OutputRaster::write(const std::complex<float>* data, int64_t count) {
  const WriteClock clock;
  if (count > 0 && std::fwrite(data, sizeof(std::complex<float>), static_cast<std::size_t>(count), file_.get()) !=
                       static_cast<std::size_t>(count))
    base::fatal(ec::kFileIo, {path_, "write failed (disk full?)"});
}

void OutputRaster::commit() {
  const WriteClock clock;
  if (std::fclose(file_.release()) != 0) base::fatal(ec::kFileIo, {path_, "close failed (disk full?)"});
  std::error_code err;
  std::filesystem::rename(part_, path_, err);
  if (err) base::fatal(ec::kFileIo, {path_, "cannot rename " + part_});
  committed_ = true;
}

}  // namespace sar::stripmap

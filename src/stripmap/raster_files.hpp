#pragma once
// Work and product rasters of the focusing stages: complex float samples in native order.
// Failures of the file layer end the job with the I/O error code naming the file; an output is
// written under "<path>.part" and renamed only when complete, so a failed run never leaves a
// file that looks whole.
#include <complex>
#include <cstdint>
#include <cstdio>
#include <memory>
#include <string>

namespace sar::stripmap {

class InputRaster {
 public:
  /// Opens `path`, which must hold at least `bytes` bytes.
  InputRaster(const std::string& path, int64_t bytes, const char* what);
  void seek(int64_t offset);
  void read(void* data, int64_t bytes);

 private:
  struct Closer {
    void operator()(std::FILE* f) const;
  };
  std::string path_, what_;
  std::unique_ptr<std::FILE, Closer> file_;
};

class OutputRaster {
 public:
  explicit OutputRaster(std::string path);
  OutputRaster(const OutputRaster&) = delete;
  OutputRaster& operator=(const OutputRaster&) = delete;
  ~OutputRaster();
  void write(const std::complex<float>* data, int64_t count);
  void commit();

 private:
  struct Closer {
    void operator()(std::FILE* f) const;
  };
  std::string path_, part_;
  std::unique_ptr<std::FILE, Closer> file_;
  bool committed_ = false;
};

/// Wall seconds spent in OutputRaster writes and commits since the process started: the job
/// reports its writing time apart from the focusing that produces the lines.
double output_write_seconds();

}  // namespace sar::stripmap

#pragma once
// Byte files of the burst chain: a reader that names the file when it is short, and a writer
// that works under "<path>.part" and renames only when complete. Failures end the job with the
// file I/O code naming the file.
#include <cstdint>
#include <cstdio>
#include <memory>
#include <string>

namespace sar::scansar {

struct FileCloser {
  void operator()(std::FILE* f) const;
};

class ByteReader {
 public:
  ByteReader(const std::string& path, const char* what);
  int64_t size() const { return size_; }
  void seek(int64_t offset);
  void read(void* data, int64_t bytes);

 private:
  std::string path_, what_;
  std::unique_ptr<std::FILE, FileCloser> file_;
  int64_t size_ = 0;
};

class ByteWriter {
 public:
  explicit ByteWriter(std::string path);
  ByteWriter(const ByteWriter&) = delete;
  ByteWriter& operator=(const ByteWriter&) = delete;
  ~ByteWriter();
  void write(const void* data, int64_t bytes);
  void commit();

 private:
  std::string path_, part_;
  std::unique_ptr<std::FILE, FileCloser> file_;
  bool committed_ = false;
};

}  // namespace sar::scansar

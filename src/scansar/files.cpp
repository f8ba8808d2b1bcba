#include "scansar/files.hpp"

#include <cerrno>
#include <cstring>
#include <filesystem>

#include "base/errors.hpp"

namespace sar::scansar {

void FileCloser::operator()(std::FILE* f) const {
  if (f) std::fclose(f);
}

ByteReader::ByteReader(const std::string& path, const char* what) : path_(path), what_(what) {
  file_.reset(std::fopen(path.c_str(), "rb"));
  if (!file_) base::fatal(base::ec::kFileIo, {path_, std::string("cannot open the ") + what_, std::strerror(errno)});
  std::error_code err;
  size_ = static_cast<int64_t>(std::filesystem::file_size(path, err));
  if (err) size_ = 0;
}

void ByteReader::seek(int64_t offset) {
  if (std::fseek(file_.get(), static_cast<long>(offset), SEEK_SET) != 0)
    base::fatal(base::ec::kFileIo, {path_, std::string("cannot seek in the ") + what_});
}

void ByteReader::read(void* data, int64_t bytes) {
  if (bytes <= 0) return;
  if (std::fread(data, 1, static_cast<std::size_t>(bytes), file_.get()) != static_cast<std::size_t>(bytes))
    base::fatal(base::ec::kFileIo, {path_, std::string("the ") + what_ + " ends early"});
}

ByteWriter::ByteWriter(std::string path) : path_(std::move(path)), part_(path_ + ".part") {
  file_.reset(std::fopen(part_.c_str(), "wb"));
  if (!file_) base::fatal(base::ec::kFileIo, {path_, "cannot create", std::strerror(errno)});
}

ByteWriter::~ByteWriter() {
  if (committed_) return;
  file_.reset();
  std::error_code err;
  std::filesystem::remove(part_, err);
}

void ByteWriter::write(const void* data, int64_t bytes) {
  if (bytes <= 0) return;
  if (std::fwrite(data, 1, static_cast<std::size_t>(bytes), file_.get()) != static_cast<std::size_t>(bytes))
    base::fatal(base::ec::kFileIo, {path_, "write failed", std::strerror(errno)});
}

void ByteWriter::commit() {
  if (std::fclose(file_.release()) != 0) base::fatal(base::ec::kFileIo, {path_, "write failed at close"});
  std::error_code err;
  std::filesystem::rename(part_, path_, err);
  if (err) base::fatal(base::ec::kFileIo, {path_, "cannot rename the finished file", err.message()});
  committed_ = true;
}

}  // namespace sar::scansar

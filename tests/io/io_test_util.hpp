#pragma once
// Helpers shared by the raster tests: a private temporary folder per test and byte access to
// the files that the engine wrote.
#include <gtest/gtest.h>

#include <unistd.h>

#include <cstdint>
#include <cstdio>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <sstream>
#include <string>
#include <vector>

namespace sar::io::test {

class TempDirTest : public ::testing::Test {
 protected:
  void SetUp() override {
    std::string name = ::testing::UnitTest::GetInstance()->current_test_info()->name();
    for (char& c : name) {
      if (c == '/') c = '_';
    }
    dir_ = std::filesystem::temp_directory_path() / ("sar_io_" + std::to_string(::getpid()) + "_" + name);
    std::filesystem::remove_all(dir_);
    std::filesystem::create_directories(dir_);
  }
  void TearDown() override { std::filesystem::remove_all(dir_); }
  std::string file(const std::string& name) const { return (dir_ / name).string(); }
  std::filesystem::path dir_;
};

/// "stem<a>_<b>.raw"-like names, built without string concatenation chains (which trip a false
/// -Wrestrict of GCC 12).
inline std::string numbered(const char* stem, int a, int b = -1) {
  char name[128];
  if (b < 0) {
    std::snprintf(name, sizeof name, "%s%d.raw", stem, a);
  } else {
    std::snprintf(name, sizeof name, "%s%d_%d.raw", stem, a, b);
  }
  return name;
}

inline std::vector<unsigned char> slurp(const std::string& path) {
  std::ifstream in(path, std::ios::binary);
  return std::vector<unsigned char>(std::istreambuf_iterator<char>(in), {});
}

inline std::string slurp_text(const std::string& path) {
  std::ifstream in(path, std::ios::binary);
  std::stringstream ss;
  ss << in.rdbuf();
  return ss.str();
}

inline void put_text(const std::string& path, const std::string& text) {
  std::ofstream(path, std::ios::binary | std::ios::trunc) << text;
}

/// Overwrites bytes of a file in place, behind the back of any open reader.
inline void poke(const std::string& path, int64_t at, const std::vector<unsigned char>& bytes) {
  std::fstream f(path, std::ios::binary | std::ios::in | std::ios::out);
  f.seekp(at);
  f.write(reinterpret_cast<const char*>(bytes.data()), static_cast<std::streamsize>(bytes.size()));
}

/// One part of `size` bytes at `at`, decoded in the given byte order (1 big-endian) without the
/// engine's swap code.
template <class T>
T decode_part(const std::vector<unsigned char>& bytes, size_t at, int order) {
  unsigned char tmp[sizeof(T)];
  for (size_t i = 0; i < sizeof(T); ++i) tmp[i] = bytes.at(at + (order == 1 ? sizeof(T) - 1 - i : i));
  T v;
  std::memcpy(&v, tmp, sizeof v);
  return v;
}

}  // namespace sar::io::test

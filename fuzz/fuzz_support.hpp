#pragma once
// Shared by the fuzz targets: most readers take a path, so each input is written to a file in a
// folder of this process, removed again when the process ends.
#include <unistd.h>

#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <filesystem>
#include <string>
#include <string_view>
#include <system_error>

namespace sar::fuzz {

inline const std::filesystem::path& scratch_dir() {
  struct Dir {
    std::filesystem::path path;
    Dir() {
      const char* base = std::getenv("SAR_FUZZ_SCRATCH");
      path = std::filesystem::path(base ? base : "/tmp") / ("sarfuzz-" + std::to_string(::getpid()));
      std::filesystem::create_directories(path);
    }
    ~Dir() {
      std::error_code err;
      std::filesystem::remove_all(path, err);
    }
  };
  static Dir dir;
  return dir.path;
}

/// Writes the input to `name` in the scratch folder and returns its path.
inline std::string input_file(const std::uint8_t* data, std::size_t size, std::string_view name) {
  const std::string path = (scratch_dir() / std::string(name)).string();
  if (std::FILE* f = std::fopen(path.c_str(), "wb")) {
    if (size) std::fwrite(data, 1, size, f);
    std::fclose(f);
  }
  return path;
}

inline std::string_view as_text(const std::uint8_t* data, std::size_t size) {
  return {reinterpret_cast<const char*>(data), size};
}

}  // namespace sar::fuzz

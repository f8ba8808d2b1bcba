#pragma once
// Helpers shared by the simulator tests: whole files, and the structure of ASCII headers.
#include <fstream>
#include <iterator>
#include <string>
#include <vector>

namespace sar::test {

inline std::string read_all(const std::string& path) {
  std::ifstream in(path, std::ios::binary);
  return {std::istreambuf_iterator<char>(in), {}};
}

// Line lengths and keys of a header: two headers agree in structure when these agree.
inline std::vector<std::string> header_shape(const std::string& bytes) {
  std::vector<std::string> shape;
  std::size_t start = 0;
  while (start < bytes.size()) {
    const std::size_t end = bytes.find('\n', start);
    const std::size_t stop = end == std::string::npos ? bytes.size() : end + 1;
    const std::string line = bytes.substr(start, stop - start);
    shape.push_back(std::to_string(line.size()) + " " + line.substr(0, line.find('=')));
    start = stop;
  }
  return shape;
}

}  // namespace sar::test

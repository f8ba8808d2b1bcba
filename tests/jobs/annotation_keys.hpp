#pragma once
// Values of an annotation in profile text (R_hdr) as a test reads them: numbers, numbers of a
// matrix that goes on over several lines, quoted texts.
#include <sstream>
#include <string>
#include <vector>

#include "job_harness.hpp"

namespace sar::test {

inline int key_int(const fs::path& annotation, const std::string& key) {
  for (const auto& l : lines_of(annotation))
    if (l.rfind(key + " = ", 0) == 0) return std::atoi(l.c_str() + key.size() + 3);
  return -1;
}

inline std::vector<double> doubles_of(const fs::path& annotation, const std::string& key) {
  // A matrix goes on with one row a line, each line opening with blanks and '{'.
  std::vector<double> v;
  bool inKey = false;
  for (const auto& l : lines_of(annotation)) {
    std::string text;
    if (l.rfind(key + " = ", 0) == 0) {
      inKey = true;
      text = l.substr(key.size() + 3);
    } else if (inKey && l.find_first_not_of(" \t") != std::string::npos && l[l.find_first_not_of(" \t")] == '{' &&
               (l[0] == ' ' || l[0] == '\t')) {
      text = l;
    } else {
      inKey = false;
      continue;
    }
    for (char& ch : text)
      if (ch == '{' || ch == '}' || ch == ',') ch = ' ';
    std::istringstream in(text);
    for (double x; in >> x;) v.push_back(x);
  }
  return v;
}

inline std::string text_of(const fs::path& annotation, const std::string& key) {
  for (const auto& l : lines_of(annotation))
    if (l.rfind(key + " = ", 0) == 0) {
      std::string t = l.substr(key.size() + 3);
      if (!t.empty() && t.front() == '"') t = t.substr(1, t.find('"', 1) - 1);
      return t;
    }
  return {};
}

}  // namespace sar::test

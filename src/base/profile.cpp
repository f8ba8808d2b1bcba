#include "base/profile.hpp"

#include <algorithm>
#include <cerrno>
#include <charconv>
#include <clocale>
#include <cstdarg>
#include <cstdio>
#include <cstdlib>
#include <fstream>
#include <iterator>
#include <limits>
#include <list>
#include <locale.h>
#include <memory>
#include <new>
#include <sstream>
#include <system_error>

#include "base/diagnostics.hpp"
#include "base/errors.hpp"

namespace sar::base {

namespace {

// ----------------------------------------------------------------------------- the cache
//
// Files, sections and keys are kept in lists: values handed out by GetSetProfileChar stay valid
// while other keys come and go. Sections and keys stand in file order; a new one goes to the end
// (it is written last), and a lookup walks from the end, so of two equal names the one that
// stood last in the file wins.

struct KeyNode {
  std::string name;
  std::string value;
};

struct SectionNode {
  std::string name;
  std::list<KeyNode> keys;
};

struct FileNode {
  std::string name;
  std::list<SectionNode> sections;
};

struct ProfileCache {
  std::list<FileNode> files;  // most recently loaded first
  FileNode* lastFound = nullptr;
};

ProfileCache& cache() {
  static ProfileCache instance;
  return instance;
}

void trim_blanks(std::string& text) {
  const auto first = text.find_first_not_of(' ');
  if (first == std::string::npos) {
    text.clear();
    return;
  }
  text.erase(text.find_last_not_of(' ') + 1);
  text.erase(0, first);
}

void trim_trailing_blanks(std::string& text) {
  const auto last = text.find_last_not_of(' ');
  text.erase(last == std::string::npos ? 0 : last + 1);
}

/// True when the line starting at `pos` is a further row of a multi-row value: one or more
/// blanks or tabs, then `{`.
bool continues_value(std::string_view text, std::size_t pos) {
  std::size_t k = pos;
  while (k < text.size() && (text[k] == ' ' || text[k] == '\t')) ++k;
  return k > pos && k < text.size() && text[k] == '{';
}

/// The reader: a character state machine.
///   0 before the first section, 1 in a section name, 2 skipping to the line end,
///   3 at the start of a line, 4 in a key, 5 in a value.
void parse_profile(std::string_view text, std::list<SectionNode>& sections) {
  int state = 0;
  std::string token;
  std::string key;
  SectionNode* current = nullptr;

  auto start_section = [&] {
    current = &sections.emplace_back();
    token.clear();
    state = 1;
  };
  auto end_value = [&] {
    trim_blanks(token);
    current->keys.push_back(KeyNode{key, token});
    token.clear();
    state = 3;
  };

  for (std::size_t i = 0; i < text.size(); ++i) {
    const char c = text[i];
    switch (state) {
      case 0:
        if (c == '[') start_section();
        break;
      case 1:
        if (c == ']') {
          trim_blanks(token);
          current->name = token;
          token.clear();
          state = 2;
        } else {
          token += c;
        }
        break;
      case 2:
        if (c == '\n') state = 3;
        break;
      case 3:
        if (c == '[') {
          start_section();
        } else if (c == ' ') {
          // leading blanks of a key
        } else if (c == '=') {
          state = 2;
        } else {
          token.assign(1, c);
          state = 4;
        }
        break;
      case 4:
        if (c == '=') {
          trim_blanks(token);
          key = token;
          token.clear();
          state = 5;
        } else if (c == '[') {
          start_section();
        } else {
          token += c;
        }
        break;
      default:  // 5
        if (c == '\n') {
          if (continues_value(text, i + 1)) {
            trim_trailing_blanks(token);
            token += '\n';
          } else {
            end_value();
          }
        } else {
          token += c;
        }
        break;
    }
  }
  if (state == 5) end_value();
}

FileNode* find_file(const std::string& name) {
  ProfileCache& c = cache();
  if (c.lastFound && c.lastFound->name == name) return c.lastFound;
  for (auto& f : c.files) {
    if (f.name == name) {
      c.lastFound = &f;
      return &f;
    }
  }
  return nullptr;
}

FileNode& load_file(const std::string& name) {
  if (FileNode* f = find_file(name)) return *f;
  ProfileCache& c = cache();
  FileNode& f = c.files.emplace_front();
  f.name = name;
  {
    ErrnoGuard guard;
    std::ifstream in(name, std::ios::binary);
    if (in) {
      std::ostringstream content;
      content << in.rdbuf();
      parse_profile(content.str(), f.sections);
    }
  }
  c.lastFound = &f;
  return f;
}

template <class List>
auto find_last(List& list, std::string_view name) {
  auto it = std::find_if(list.rbegin(), list.rend(), [&](const auto& node) { return node.name == name; });
  return it == list.rend() ? list.end() : std::prev(it.base());
}

/// One file's text as SyncProfile writes it.
std::string render(const FileNode& file) {
  std::string out;
  bool first = true;
  for (const auto& section : file.sections) {
    if (!first) out += '\n';
    first = false;
    out += '[';
    out += section.name;
    out += "]\n";
    for (const auto& key : section.keys) {
      out += key.name;
      out += " = ";
      out += key.value;
      out += '\n';
    }
  }
  return out;
}

int write_file(const FileNode& file) {
  ErrnoGuard guard;
  const std::string text = render(file);
  // Written beside and renamed over, so that a full disk leaves the old file or none, never a
  // header cut in the middle that a reader would take for complete.
  const std::string part = file.name + ".part";
  std::FILE* fp = std::fopen(part.c_str(), "w");
  if (!fp) return 1;
  const bool written = std::fwrite(text.data(), 1, text.size(), fp) == text.size();
  const bool closed = std::fclose(fp) == 0;
  if (written && closed && std::rename(part.c_str(), file.name.c_str()) == 0) return 0;
  std::remove(part.c_str());
  return -1;
}

// ----------------------------------------------------------------------------- texts

std::string str(std::string_view view) { return std::string(view); }

int as_int(std::size_t n) {
  return static_cast<int>(std::min<std::size_t>(n, static_cast<std::size_t>(std::numeric_limits<int>::max())));
}

void warn_read_only(std::size_t got, std::size_t wanted, std::string_view section, std::string_view key,
                    const std::string& file) {
  report(kReportWarning, format_text("Read only %d elements of %d - SEC: %s, KEY: %s, FILE: %s", as_int(got),
                                     as_int(wanted), str(section).c_str(), str(key).c_str(), file.c_str()));
}

int write_failed(std::string_view section, std::string_view key, const std::string& file) {
  report(kReportWarning, format_text("Parameter writing failed - SEC: %s, KEY: %s, FILE: %s", str(section).c_str(),
                                     str(key).c_str(), file.c_str()));
  return kProfileFailed;
}

/// The end of a checked operation that failed: its line on the error stream, then status 1.
[[noreturn]] void checked_exit(const std::string& line) {
  std::fputs(line.c_str(), stderr);
  std::fflush(stderr);
  throw ProcessExit{1};
}

[[noreturn]] void checked_exit(const char* operation, std::string_view section, std::string_view key,
                               const std::string& file) {
  checked_exit(format_text("Error in %s: section %s, key %s, file %s\n", operation, str(section).c_str(),
                           str(key).c_str(), file.c_str()));
}

// ----------------------------------------------------------------------------- numbers

bool is_c_space(char c) { return c == ' ' || c == '\t' || c == '\n' || c == '\v' || c == '\f' || c == '\r'; }

locale_t c_locale() {
  static const locale_t loc = newlocale(LC_ALL_MASK, "C", static_cast<locale_t>(nullptr));
  return loc;
}

/// A token converted as far as it goes, as a scan of one number would: leading white space and a
/// sign are taken, anything after the number is ignored. False when nothing converts.
template <class T>
bool convert_token(const std::string& token, T& out) {
  if constexpr (std::is_floating_point_v<T>) {
    ErrnoGuard guard;
    char* end = nullptr;
    T value;
    if constexpr (std::is_same_v<T, float>) {
      value = strtof_l(token.c_str(), &end, c_locale());
    } else {
      value = strtod_l(token.c_str(), &end, c_locale());
    }
    if (end == token.c_str()) return false;
    out = value;
    return true;
  } else {
    const char* b = token.data();
    const char* e = token.data() + token.size();
    while (b < e && is_c_space(*b)) ++b;
    if (b < e && *b == '+') {
      ++b;
      if (b == e || *b < '0' || *b > '9') return false;
    }
    T value{};
    const auto res = std::from_chars(b, e, value);
    if (res.ec != std::errc()) return false;
    out = value;
    return true;
  }
}

/// Elements of a number list: after an optional leading `{`, tokens separated by blanks and
/// tabs, up to the first that doesn't convert (a closing `}` among them).
template <class T>
std::size_t parse_numbers(std::string_view text, std::span<T> out) {
  std::size_t pos = !text.empty() && text.front() == '{' ? 1 : 0;
  std::size_t n = 0;
  while (n < out.size()) {
    while (pos < text.size() && (text[pos] == ' ' || text[pos] == '\t')) ++pos;
    if (pos >= text.size()) break;
    std::size_t end = pos;
    while (end < text.size() && text[end] != ' ' && text[end] != '\t') ++end;
    T value{};
    if (!convert_token(std::string(text.substr(pos, end - pos)), value)) break;
    out[n++] = value;
    pos = end;
  }
  return n;
}

template <class T>
int read_numbers(std::string_view section, std::string_view key, std::span<T> values, const std::string& file) {
  const std::string* text = GetSetProfileChar(0, section, key, {}, file);
  if (!text) return kProfileFailed;
  const std::size_t n = parse_numbers(std::string_view(*text), values);
  if (n < values.size()) {
    warn_read_only(n, values.size(), section, key, file);
    return kProfileFailed;
  }
  return kProfileOk;
}

/// Elements of a string list `{"a" "b"}` stored from `values[offset]`, each cut to size - 1
/// characters. Returns the number that stand: the scan stops at `count`, or at a character other
/// than a blank or a quote, which keeps what was read when it is `}` and drops it all otherwise.
std::size_t parse_strings(std::string_view text, std::vector<std::string>& values, std::size_t offset,
                          std::size_t count, std::size_t size) {
  if (text.empty() || text.front() != '{') return 0;
  const std::size_t keep = size > 0 ? size - 1 : 0;
  std::size_t n = 0;
  std::size_t pos = 1;
  while (n < count) {
    if (pos >= text.size()) return 0;
    const char c = text[pos];
    if (c == ' ') {
      ++pos;
    } else if (c == '"') {
      const std::size_t close = text.find('"', pos + 1);
      if (close == std::string_view::npos) return 0;
      values[offset + n] = std::string(text.substr(pos + 1, std::min(close - pos - 1, keep)));
      ++n;
      pos = close + 1;
    } else {
      return c == '}' ? n : 0;
    }
  }
  return n;
}

template <class T>
void append_number(std::string& out, T value) {
  char buffer[64];
  std::to_chars_result res{};
  if constexpr (std::is_same_v<T, float>) {
    res = std::to_chars(buffer, buffer + sizeof buffer, static_cast<double>(value), std::chars_format::general, 7);
  } else if constexpr (std::is_same_v<T, double>) {
    res = std::to_chars(buffer, buffer + sizeof buffer, value, std::chars_format::general, 15);
  } else {
    res = std::to_chars(buffer, buffer + sizeof buffer, value);
  }
  out.append(buffer, res.ptr);
  out += ' ';
}

template <class T>
std::string number_row(std::span<const T> values) {
  std::string text = "{";
  for (const T& v : values) append_number(text, v);
  trim_trailing_blanks(text);
  text += '}';
  return text;
}

std::string string_row(std::span<const std::string> values) {
  std::string text = "{";
  for (const auto& v : values) {
    text += '"';
    text += v;
    text += "\" ";
  }
  trim_trailing_blanks(text);
  text += '}';
  return text;
}

template <class T>
std::string single_number(T value) {
  std::string text;
  append_number(text, value);
  trim_trailing_blanks(text);
  return text;
}

int store(std::string_view section, std::string_view key, std::string_view text, const std::string& file) {
  if (!GetSetProfileChar(1, section, key, text, file)) return write_failed(section, key, file);
  return kProfileOk;
}

bool matrix_fits(int rows, int cols, std::size_t available) {
  return rows >= 0 && cols >= 0 &&
         static_cast<uint64_t>(rows) * static_cast<uint64_t>(cols) <= static_cast<uint64_t>(available);
}

/// The rows of a multi-row value; rows after the first lose their leading blanks and tabs.
std::vector<std::string_view> value_rows(std::string_view text) {
  std::vector<std::string_view> rows;
  std::size_t pos = 0;
  for (;;) {
    const std::size_t nl = text.find('\n', pos);
    std::string_view row = text.substr(pos, nl == std::string_view::npos ? std::string_view::npos : nl - pos);
    if (!rows.empty()) {
      while (!row.empty() && (row.front() == ' ' || row.front() == '\t')) row.remove_prefix(1);
    }
    rows.push_back(row);
    if (nl == std::string_view::npos) break;
    pos = nl + 1;
  }
  return rows;
}

template <class T>
int write_matrix(std::string_view section, std::string_view key, std::span<const T> values, int rows, int cols,
                 const std::string& file, std::string (*row_text)(std::span<const T>)) {
  if (!matrix_fits(rows, cols, values.size())) return write_failed(section, key, file);
  std::string text;
  const auto width = static_cast<std::size_t>(cols);
  for (int r = 0; r < rows; ++r) {
    if (r > 0) text += "\n\t";
    text += row_text(values.subspan(static_cast<std::size_t>(r) * width, width));
  }
  return store(section, key, text, file);
}

}  // namespace

// ----------------------------------------------------------------------------- core

const std::string* GetSetProfileChar(int write, std::string_view section, std::string_view key,
                                     std::string_view value, const std::string& file) {
  try {
    FileNode& f = load_file(file);
    auto s = find_last(f.sections, section);
    if (write == 0) {
      if (s == f.sections.end()) return nullptr;
      auto k = find_last(s->keys, key);
      return k == s->keys.end() ? nullptr : &k->value;
    }
    if (s == f.sections.end()) {
      s = f.sections.insert(f.sections.end(), SectionNode{});
      s->name.assign(section);
    }
    auto k = find_last(s->keys, key);
    if (k == s->keys.end()) {
      k = s->keys.insert(s->keys.end(), KeyNode{});
      k->name.assign(key);
    }
    k->value.assign(value.data(), value.size());
    return &k->value;
  } catch (const std::bad_alloc&) {
    std::fputs("Memory allocation failure\n", stderr);
    throw ProcessExit{1};
  }
}

int SyncProfile(const std::string& file) {
  FileNode* f = find_file(file);
  return f ? write_file(*f) : 0;
}

int SyncProfile() {
  int result = 0;
  auto& files = cache().files;
  // The earliest loaded file stands last in the list and is written first.
  for (auto it = files.rbegin(); it != files.rend(); ++it)
    if (write_file(*it) != 0) result = -1;
  return result;
}

void FreeProfile(const std::string& file) {
  ProfileCache& c = cache();
  c.lastFound = nullptr;
  c.files.remove_if([&](const FileNode& f) { return f.name == file; });
}

void FreeProfile() {
  ProfileCache& c = cache();
  c.lastFound = nullptr;
  c.files.clear();
}

void DelProfileKey(std::string_view section, std::string_view key, const std::string& file) {
  FileNode* f = find_file(file);
  if (!f) {
    std::fputs("Warning: DelProfileKey called before init\n", stderr);
    return;
  }
  auto s = find_last(f->sections, section);
  if (s == f->sections.end()) return;
  auto k = find_last(s->keys, key);
  if (k != s->keys.end()) s->keys.erase(k);
}

void DelProfileSection(std::string_view section, const std::string& file) {
  FileNode* f = find_file(file);
  if (!f) {
    std::fputs("Warning: DelProfileSection called before init\n", stderr);
    return;
  }
  auto s = find_last(f->sections, section);
  if (s != f->sections.end()) f->sections.erase(s);
}

// ----------------------------------------------------------------------------- reads

int GetMyProfileString(std::string_view section, std::string_view key, std::string& value, std::size_t size,
                       const std::string& file) {
  const std::string* text = GetSetProfileChar(0, section, key, {}, file);
  if (!text) return kProfileFailed;
  value.assign(*text, 0, size > 0 ? size - 1 : 0);
  return kProfileOk;
}

int GetMyProfileStringArray(std::string_view section, std::string_view key, std::vector<std::string>& values,
                            int count, const std::string& file, std::size_t size) {
  const std::string* text = GetSetProfileChar(0, section, key, {}, file);
  if (!text) return kProfileFailed;
  const auto wanted = static_cast<std::size_t>(std::max(count, 0));
  if (values.size() < wanted) values.resize(wanted);
  // A value that isn't a list stores nothing and still succeeds.
  if (text->empty() || text->front() != '{') return kProfileOk;
  const std::size_t n = parse_strings(*text, values, 0, wanted, size);
  if (n < wanted) {
    warn_read_only(n, wanted, section, key, file);
    return kProfileFailed;
  }
  return kProfileOk;
}

int GetMyProfileIntArray(std::string_view section, std::string_view key, std::span<int32_t> values,
                         const std::string& file) {
  return read_numbers(section, key, values, file);
}

int GetMyProfileInt64Array(std::string_view section, std::string_view key, std::span<int64_t> values,
                           const std::string& file) {
  return read_numbers(section, key, values, file);
}

int GetMyProfileLongArray(std::string_view section, std::string_view key, std::span<long> values,
                          const std::string& file) {
  return read_numbers(section, key, values, file);
}

int GetMyProfileFloatArray(std::string_view section, std::string_view key, std::span<float> values,
                           const std::string& file) {
  return read_numbers(section, key, values, file);
}

int GetProfileDoubleArray(std::string_view section, std::string_view key, std::span<double> values,
                          const std::string& file) {
  return read_numbers(section, key, values, file);
}

int GetMyProfileDoubleMatrix(std::string_view section, std::string_view key, std::span<double> values, int rows,
                             int cols, const std::string& file) {
  const std::string* text = GetSetProfileChar(0, section, key, {}, file);
  if (!text) return kProfileFailed;
  if (!matrix_fits(rows, cols, values.size())) {
    warn_read_only(0, values.size(), section, key, file);
    return kProfileFailed;
  }
  const auto width = static_cast<std::size_t>(cols);
  const std::size_t wanted = static_cast<std::size_t>(rows) * width;
  const auto lines = value_rows(*text);
  std::size_t total = 0;
  for (std::size_t r = 0; r < static_cast<std::size_t>(rows) && r < lines.size(); ++r) {
    const std::size_t n = parse_numbers(lines[r], values.subspan(r * width, width));
    total += n;
    if (n < width) break;
  }
  if (total < wanted) {
    warn_read_only(total, wanted, section, key, file);
    return kProfileFailed;
  }
  return kProfileOk;
}

int GetMyProfileStringMatrix(std::string_view section, std::string_view key, std::vector<std::string>& values,
                             int rows, int cols, const std::string& file, std::size_t size) {
  const std::string* text = GetSetProfileChar(0, section, key, {}, file);
  if (!text) return kProfileFailed;
  if (rows < 0 || cols < 0) {
    warn_read_only(0, 0, section, key, file);
    return kProfileFailed;
  }
  const auto width = static_cast<std::size_t>(cols);
  const std::size_t wanted = static_cast<std::size_t>(rows) * width;
  if (values.size() < wanted) values.resize(wanted);
  const auto lines = value_rows(*text);
  std::size_t total = 0;
  for (std::size_t r = 0; r < static_cast<std::size_t>(rows) && r < lines.size(); ++r) {
    const std::size_t n = parse_strings(lines[r], values, r * width, width, size);
    total += n;
    if (n < width) break;
  }
  if (total < wanted) {
    warn_read_only(total, wanted, section, key, file);
    return kProfileFailed;
  }
  return kProfileOk;
}

// ----------------------------------------------------------------------------- writes

int WriteMyProfileString(std::string_view section, std::string_view key, std::string_view value,
                         const std::string& file) {
  return store(section, key, value, file);
}

int WriteMyProfileStringQuote(std::string_view section, std::string_view key, std::string_view value,
                              const std::string& file) {
  std::string text = "\"";
  text += value;
  text += '"';
  return store(section, key, text, file);
}

int WriteMyProfileStringArray(std::string_view section, std::string_view key, std::span<const std::string> values,
                              const std::string& file) {
  return store(section, key, string_row(values), file);
}

int WriteMyProfileStringMatrix(std::string_view section, std::string_view key, std::span<const std::string> values,
                               int rows, int cols, const std::string& file) {
  return write_matrix<std::string>(section, key, values, rows, cols, file, &string_row);
}

int WriteMyProfileIntArray(std::string_view section, std::string_view key, std::span<const int32_t> values,
                           const std::string& file) {
  return store(section, key, number_row(values), file);
}

int WriteMyProfileInt64Array(std::string_view section, std::string_view key, std::span<const int64_t> values,
                             const std::string& file) {
  return store(section, key, number_row(values), file);
}

int WriteMyProfileLongArray(std::string_view section, std::string_view key, std::span<const long> values,
                            const std::string& file) {
  return store(section, key, number_row(values), file);
}

int WriteMyProfileFloatArray(std::string_view section, std::string_view key, std::span<const float> values,
                             const std::string& file) {
  return store(section, key, number_row(values), file);
}

int WriteProfileDoubleArray(std::string_view section, std::string_view key, std::span<const double> values,
                            const std::string& file) {
  return store(section, key, number_row(values), file);
}

int WriteMyProfileDoubleMatrix(std::string_view section, std::string_view key, std::span<const double> values,
                               int rows, int cols, const std::string& file) {
  return write_matrix<double>(section, key, values, rows, cols, file, &number_row<double>);
}

int WriteMyProfileInt(std::string_view section, std::string_view key, int32_t value, const std::string& file) {
  return store(section, key, single_number(value), file);
}

int WriteMyProfileInt64(std::string_view section, std::string_view key, int64_t value, const std::string& file) {
  return store(section, key, single_number(value), file);
}

int WriteMyProfileDouble(std::string_view section, std::string_view key, double value, const std::string& file) {
  return store(section, key, single_number(value), file);
}

// ----------------------------------------------------------------------------- checked forms

void GetCheckMyProfileString(std::string_view section, std::string_view key, std::string& value, std::size_t size,
                             const std::string& file) {
  if (GetMyProfileString(section, key, value, size, file) != kProfileOk)
    checked_exit("GetMyProfileString", section, key, file);
}

void GetCheckMyProfileStringArray(std::string_view section, std::string_view key, std::vector<std::string>& values,
                                  int count, const std::string& file, std::size_t size) {
  if (GetMyProfileStringArray(section, key, values, count, file, size) != kProfileOk)
    checked_exit("GetMyProfileStringArray", section, key, file);
}

void GetCheckMyProfileIntArray(std::string_view section, std::string_view key, std::span<int32_t> values,
                               const std::string& file) {
  if (GetMyProfileIntArray(section, key, values, file) != kProfileOk)
    checked_exit("GetMyProfileIntArray", section, key, file);
}

void GetCheckMyProfileInt64Array(std::string_view section, std::string_view key, std::span<int64_t> values,
                                 const std::string& file) {
  if (GetMyProfileInt64Array(section, key, values, file) != kProfileOk)
    checked_exit("GetMyProfileInt64Array", section, key, file);
}

void GetCheckMyProfileLongArray(std::string_view section, std::string_view key, std::span<long> values,
                                const std::string& file) {
  if (GetMyProfileLongArray(section, key, values, file) != kProfileOk)
    checked_exit("GetMyProfileLongArray", section, key, file);
}

void GetCheckMyProfileFloatArray(std::string_view section, std::string_view key, std::span<float> values,
                                 const std::string& file) {
  if (GetMyProfileFloatArray(section, key, values, file) != kProfileOk)
    checked_exit("GetMyProfileFloatArray", section, key, file);
}

// The double forms, read and write, share the words of the single double write.
void GetCheckMyProfileDoubleArray(std::string_view section, std::string_view key, std::span<double> values,
                                  const std::string& file) {
  if (GetProfileDoubleArray(section, key, values, file) != kProfileOk)
    checked_exit("WriteMyProfileDouble", section, key, file);
}

void WriteCheckMyProfileString(std::string_view section, std::string_view key, std::string_view value,
                               const std::string& file) {
  if (WriteMyProfileString(section, key, value, file) != kProfileOk)
    checked_exit(format_text("Error in WriteMyProfileString: section %s, key %s, string %s, file %s\n",
                             str(section).c_str(), str(key).c_str(), str(value).c_str(), file.c_str()));
}

void WriteCheckMyProfileIntArray(std::string_view section, std::string_view key, std::span<const int32_t> values,
                                 const std::string& file) {
  if (WriteMyProfileIntArray(section, key, values, file) != kProfileOk)
    checked_exit("WriteMyProfileIntArray", section, key, file);
}

void WriteCheckMyProfileInt64Array(std::string_view section, std::string_view key, std::span<const int64_t> values,
                                   const std::string& file) {
  if (WriteMyProfileInt64Array(section, key, values, file) != kProfileOk)
    checked_exit("WriteMyProfileInt64Array", section, key, file);
}

void WriteCheckMyProfileLongArray(std::string_view section, std::string_view key, std::span<const long> values,
                                  const std::string& file) {
  if (WriteMyProfileLongArray(section, key, values, file) != kProfileOk)
    checked_exit("WriteMyProfileLongArray", section, key, file);
}

void WriteCheckMyProfileFloatArray(std::string_view section, std::string_view key, std::span<const float> values,
                                   const std::string& file) {
  if (WriteMyProfileFloatArray(section, key, values, file) != kProfileOk)
    checked_exit("WriteMyProfileDouble", section, key, file);
}

void WriteCheckMyProfileDoubleArray(std::string_view section, std::string_view key, std::span<const double> values,
                                    const std::string& file) {
  if (WriteProfileDoubleArray(section, key, values, file) != kProfileOk)
    checked_exit("WriteMyProfileDouble", section, key, file);
}

void WriteCheckMyProfileInt(std::string_view section, std::string_view key, int32_t value, const std::string& file) {
  if (WriteMyProfileInt(section, key, value, file) != kProfileOk)
    checked_exit(format_text("Error in WriteMyProfileInt: section %s, key %s, value %d, file %s\n",
                             str(section).c_str(), str(key).c_str(), value, file.c_str()));
}

void WriteCheckMyProfileInt64(std::string_view section, std::string_view key, int64_t value,
                              const std::string& file) {
  // The line shows the value in the %f form of its siblings.
  if (WriteMyProfileInt64(section, key, value, file) != kProfileOk)
    checked_exit(format_text("Error in WriteMyProfileInt64: section %s, key %s, value %f, file %s\n",
                             str(section).c_str(), str(key).c_str(), static_cast<double>(value), file.c_str()));
}

void WriteCheckMyProfileDouble(std::string_view section, std::string_view key, double value,
                               const std::string& file) {
  if (WriteMyProfileDouble(section, key, value, file) != kProfileOk)
    checked_exit(format_text("Error in WriteMyProfileDouble: section %s, key %s, value %f, file %s\n",
                             str(section).c_str(), str(key).c_str(), value, file.c_str()));
}

int32_t GetCheckMyProfileInt(std::string_view section, std::string_view key, const std::string& file) {
  int32_t value = 0;
  GetCheckMyProfileIntArray(section, key, std::span<int32_t>(&value, 1), file);
  return value;
}

double GetCheckMyProfileDouble(std::string_view section, std::string_view key, const std::string& file) {
  double value = 0.0;
  GetCheckMyProfileDoubleArray(section, key, std::span<double>(&value, 1), file);
  return value;
}

// ----------------------------------------------------------------------------- single-value family

int GetParString(const std::string& file, std::string_view key, int /*count*/, std::string& value,
                 std::size_t /*size*/, std::string_view section) {
  return GetMyProfileString(section, key, value, 512, file);
}

int GetParInt(const std::string& file, std::string_view key, std::span<int32_t> values, std::string_view section) {
  return GetMyProfileIntArray(section, key, values, file);
}

int GetParFloat(const std::string& file, std::string_view key, std::span<float> values, std::string_view section) {
  return GetMyProfileFloatArray(section, key, values, file);
}

int GetParDouble(const std::string& file, std::string_view key, std::span<double> values,
                 std::string_view section) {
  return GetProfileDoubleArray(section, key, values, file);
}

namespace {
int synced(int status, const std::string& file) {
  if (status != kProfileOk) return status;
  return SyncProfile(file) == 0 ? kProfileOk : kProfileFailed;
}
}  // namespace

int SetParString(const std::string& file, std::string_view key, std::string_view value, std::string_view section) {
  return synced(WriteMyProfileString(section, key, value, file), file);
}

int SetParInt(const std::string& file, std::string_view key, std::span<const int32_t> values,
              std::string_view section) {
  return synced(WriteMyProfileIntArray(section, key, values, file), file);
}

int SetParFloat(const std::string& file, std::string_view key, std::span<const float> values,
                std::string_view section) {
  return synced(WriteMyProfileFloatArray(section, key, values, file), file);
}

int SetParDouble(const std::string& file, std::string_view key, std::span<const double> values,
                 std::string_view section) {
  return synced(WriteProfileDoubleArray(section, key, values, file), file);
}

}  // namespace sar::base

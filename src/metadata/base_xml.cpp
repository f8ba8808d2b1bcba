#include "metadata/base_xml.hpp"

#include <algorithm>
#include <cmath>
#include <cstdio>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <limits>
#include <system_error>

#include "base/diagnostics.hpp"
#include "base/profile.hpp"

namespace sar::metadata {

namespace {

std::string join_path(std::string_view section, std::string_view name) {
  std::string out(section);
  out += '/';
  out += name;
  return out;
}

const char* type_word(ParameterType t) {
  switch (t) {
    case kParDouble: return "double";
    case kParFloat: return "float";
    case kParInt:
    case kParInt64: return "int";
    case kParString: return "string";
  }
  return "int";
}

void report_missing(const parElement& e, int channel, const std::string& path, std::string_view section, bool xml) {
  char text[2048];
  if (xml) {
    std::snprintf(text, sizeof text, "Cannot read %s '%s' in channel %d, from XML file %s", type_word(e.type),
                  join_path(section, e.name).c_str(), channel, path.c_str());
  } else {
    std::snprintf(text, sizeof text, "Cannot read %s '%s' in section %s, from file %s", type_word(e.type),
                  e.name.c_str(), std::string(section).c_str(), path.c_str());
  }
  sar::base::report(sar::base::kReportWarning, text);
}

void report_range(const parElement& e, const std::string& path, std::string_view section) {
  char text[2048];
  std::snprintf(text, sizeof text, "Value of '%s' out of range [%.15g, %.15g] in file %s",
                join_path(section, e.name).c_str(), e.low, e.high, path.c_str());
  sar::base::report(sar::base::kReportWarning, text);
}

template <class T>
bool in_range(const parElement& e, std::span<const T> values) {
  if (!e.has_range()) return true;
  for (T v : values) {
    const double d = static_cast<double>(v);
    if (!(d >= e.low && d <= e.high)) return false;
  }
  return true;
}

void store_chars(std::span<char> buffer, const std::string& value) {
  if (buffer.empty()) return;
  const size_t n = std::min(value.size(), buffer.size() - 1);
  std::memcpy(buffer.data(), value.data(), n);
  buffer[n] = '\0';
}

std::string chars_of(std::span<char> buffer) {
  return std::string(buffer.data(), strnlen(buffer.data(), buffer.size()));
}

// The two dialects share the element walk; only the access to one element differs.
struct ElementIo {
  virtual ~ElementIo() = default;
  virtual bool get_int(const std::string& name, std::span<int32_t> v) = 0;
  virtual bool get_int64(const std::string& name, std::span<int64_t> v) = 0;
  virtual bool get_float(const std::string& name, std::span<float> v) = 0;
  virtual bool get_double(const std::string& name, std::span<double> v) = 0;
  virtual bool get_string(const std::string& name, std::span<std::string> v) = 0;
};

template <class T, class Get>
int read_numbers(const parElement& e, T* field, Get get) {
  std::vector<T> tmp(static_cast<size_t>(e.count));
  if (!get(std::span<T>(tmp))) return 1;
  if (!in_range<T>(e, tmp)) return 2;
  std::copy(tmp.begin(), tmp.end(), field);
  return 0;
}

// 0 read, 1 missing, 2 refused by its range.
int read_element(const parElement& e, ElementIo& io) {
  const auto count = static_cast<size_t>(e.count);
  if (auto p = std::get_if<int32_t*>(&e.address)) {
    return read_numbers<int32_t>(e, *p, [&](std::span<int32_t> v) { return io.get_int(e.name, v); });
  }
  if (auto p = std::get_if<int64_t*>(&e.address)) {
    return read_numbers<int64_t>(e, *p, [&](std::span<int64_t> v) { return io.get_int64(e.name, v); });
  }
  if (auto p = std::get_if<float*>(&e.address)) {
    return read_numbers<float>(e, *p, [&](std::span<float> v) { return io.get_float(e.name, v); });
  }
  if (auto p = std::get_if<double*>(&e.address)) {
    return read_numbers<double>(e, *p, [&](std::span<double> v) { return io.get_double(e.name, v); });
  }
  if (auto p = std::get_if<std::string*>(&e.address)) {
    std::vector<std::string> tmp(count);
    if (!io.get_string(e.name, tmp)) return 1;
    std::move(tmp.begin(), tmp.end(), *p);
    return 0;
  }
  if (auto p = std::get_if<std::span<char>>(&e.address)) {
    std::vector<std::string> tmp(1);
    if (!io.get_string(e.name, tmp)) return 1;
    store_chars(*p, tmp.front());
    return 0;
  }
  return 1;
}

struct XmlReader final : ElementIo {
  const ombrixxml& doc;
  int channel;
  std::string_view section;
  XmlReader(const ombrixxml& d, int c, std::string_view s) : doc(d), channel(c), section(s) {}
  bool get_int(const std::string& n, std::span<int32_t> v) override { return doc.readInt(channel, join_path(section, n), v) == 0; }
  bool get_int64(const std::string& n, std::span<int64_t> v) override {
    return doc.readInt64(channel, join_path(section, n), v) == 0;
  }
  bool get_float(const std::string& n, std::span<float> v) override {
    return doc.readFloat(channel, join_path(section, n), v) == 0;
  }
  bool get_double(const std::string& n, std::span<double> v) override {
    return doc.readDouble(channel, join_path(section, n), v) == 0;
  }
  bool get_string(const std::string& n, std::span<std::string> v) override {
    return doc.readString(channel, join_path(section, n), v) == 0;
  }
};

struct ProfileReader final : ElementIo {
  const std::string& file;
  std::string_view section;
  ProfileReader(const std::string& f, std::string_view s) : file(f), section(s) {}
  bool get_int(const std::string& n, std::span<int32_t> v) override {
    return sar::base::GetMyProfileIntArray(section, n, v, file) == sar::base::kProfileOk;
  }
  bool get_int64(const std::string& n, std::span<int64_t> v) override {
    return sar::base::GetMyProfileInt64Array(section, n, v, file) == sar::base::kProfileOk;
  }
  bool get_float(const std::string& n, std::span<float> v) override {
    return sar::base::GetMyProfileFloatArray(section, n, v, file) == sar::base::kProfileOk;
  }
  bool get_double(const std::string& n, std::span<double> v) override {
    return sar::base::GetProfileDoubleArray(section, n, v, file) == sar::base::kProfileOk;
  }
  bool get_string(const std::string& n, std::span<std::string> v) override {
    constexpr size_t kUnbounded = std::numeric_limits<size_t>::max();
    if (v.size() == 1) return sar::base::GetMyProfileString(section, n, v[0], kUnbounded, file) == sar::base::kProfileOk;
    std::vector<std::string> values;
    if (sar::base::GetMyProfileStringArray(section, n, values, static_cast<int>(v.size()), file, kUnbounded) !=
            sar::base::kProfileOk ||
        values.size() < v.size()) {
      return false;
    }
    std::move(values.begin(), values.begin() + static_cast<std::ptrdiff_t>(v.size()), v.begin());
    return true;
  }
};

int read_all(std::vector<parElement>& elements, ElementIo& io, const std::string& path, int channel,
             std::string_view section, bool xml) {
  int status = 0;
  for (const parElement& e : elements) {
    if (e.count <= 0) continue;
    const int st = read_element(e, io);
    if (st == 1) {
      report_missing(e, channel, path, section, xml);
      if (e.required) status = 1;
    } else if (st == 2) {
      report_range(e, path, section);
      status = 1;
    }
  }
  return status;
}

int write_xml_element(ombrixxml& doc, int channel, const std::string& path, const parElement& e) {
  const auto count = static_cast<size_t>(e.count);
  if (auto p = std::get_if<int32_t*>(&e.address)) return doc.writeInt(channel, path, {*p, count});
  if (auto p = std::get_if<int64_t*>(&e.address)) return doc.writeInt64(channel, path, {*p, count});
  if (auto p = std::get_if<float*>(&e.address)) return doc.writeFloat(channel, path, {*p, count});
  if (auto p = std::get_if<double*>(&e.address)) return doc.writeDouble(channel, path, {*p, count});
  if (auto p = std::get_if<std::string*>(&e.address)) return doc.writeString(channel, path, {*p, count});
  if (auto p = std::get_if<std::span<char>>(&e.address)) {
    const std::string value = chars_of(*p);
    return doc.writeString(channel, path, {&value, 1});
  }
  return 1;
}

int write_profile_element(const std::string& file, std::string_view section, const parElement& e) {
  using namespace sar::base;
  const auto count = static_cast<size_t>(e.count);
  int st = kProfileFailed;
  if (auto p = std::get_if<int32_t*>(&e.address)) {
    st = count == 1 ? WriteMyProfileInt(section, e.name, **p, file)
                    : WriteMyProfileIntArray(section, e.name, {*p, count}, file);
  } else if (auto p = std::get_if<int64_t*>(&e.address)) {
    st = count == 1 ? WriteMyProfileInt64(section, e.name, **p, file)
                    : WriteMyProfileInt64Array(section, e.name, {*p, count}, file);
  } else if (auto p = std::get_if<float*>(&e.address)) {
    // A single float goes out as a plain number; its double form reads back to the same float.
    st = count == 1 ? WriteMyProfileDouble(section, e.name, static_cast<double>(**p), file)
                    : WriteMyProfileFloatArray(section, e.name, {*p, count}, file);
  } else if (auto p = std::get_if<double*>(&e.address)) {
    st = count == 1 ? WriteMyProfileDouble(section, e.name, **p, file)
                    : WriteProfileDoubleArray(section, e.name, {*p, count}, file);
  } else if (auto p = std::get_if<std::string*>(&e.address)) {
    st = count == 1 ? WriteMyProfileString(section, e.name, **p, file)
                    : WriteMyProfileStringArray(section, e.name, {*p, count}, file);
  } else if (auto p = std::get_if<std::span<char>>(&e.address)) {
    st = WriteMyProfileString(section, e.name, chars_of(*p), file);
  }
  return st == kProfileOk ? 0 : 1;
}

}  // namespace

void parElement::setElement(std::string_view elementName, ParameterType elementType, int elementCount, Address where,
                            double lowLimit, double highLimit, bool isRequired) {
  name = std::string(elementName);
  type = elementType;
  count = elementCount;
  address = where;
  low = lowLimit;
  high = highLimit;
  required = isRequired;
}

HeaderDialect header_dialect(const std::string& path) {
  std::error_code ec;
  if (!std::filesystem::is_regular_file(path, ec)) return HeaderDialect::kMissing;
  {
    // A file whose first visible character is '<' is meant as XML; it never goes to the profile
    // reader, whose cache would otherwise write its own reading of the file back at a sync.
    std::ifstream in(path, std::ios::binary);
    char c = 0;
    bool xml_like = false;
    int looked = 0;
    while (in.get(c) && looked++ < 4096) {
      if (c == ' ' || c == '\t' || c == '\r' || c == '\n') continue;
      // A UTF-8 byte order mark may precede the declaration.
      if (static_cast<unsigned char>(c) == 0xEF || static_cast<unsigned char>(c) == 0xBB ||
          static_cast<unsigned char>(c) == 0xBF) {
        continue;
      }
      xml_like = c == '<';
      break;
    }
    if (!xml_like) return HeaderDialect::kProfile;
  }
  ombrixxml doc;
  return doc.initXmlFile(path, XmlOpen::kExisting) == XmlOpenResult::kOk ? HeaderDialect::kXml
                                                                          : HeaderDialect::kOtherXml;
}

GeneralSAR_BaseXML::GeneralSAR_BaseXML(const GeneralSAR_BaseXML& other)
    : GeneralSAR_Base(other),
      channel_(other.channel_),
      section_(other.section_),
      auxPath_(other.auxPath_),
      allocated_(other.allocated_) {}

GeneralSAR_BaseXML& GeneralSAR_BaseXML::operator=(const GeneralSAR_BaseXML& other) {
  if (this != &other) {
    elements_.clear();
    xml_.clean();
    channel_ = other.channel_;
    section_ = other.section_;
    auxPath_ = other.auxPath_;
    allocated_ = other.allocated_;
  }
  return *this;
}

GeneralSAR_BaseXML::GeneralSAR_BaseXML(GeneralSAR_BaseXML&& other) noexcept : GeneralSAR_BaseXML() {
  channel_ = other.channel_;
  section_ = std::move(other.section_);
  auxPath_ = std::move(other.auxPath_);
  allocated_ = other.allocated_;
}

GeneralSAR_BaseXML& GeneralSAR_BaseXML::operator=(GeneralSAR_BaseXML&& other) noexcept {
  if (this != &other) {
    elements_.clear();
    xml_.clean();
    channel_ = other.channel_;
    section_ = std::move(other.section_);
    auxPath_ = std::move(other.auxPath_);
    allocated_ = other.allocated_;
  }
  return *this;
}

void GeneralSAR_BaseXML::createElementsVector(int count) {
  elements_.clear();
  if (count > 0) elements_.reserve(static_cast<size_t>(count));
}

int GeneralSAR_BaseXML::add(std::string_view name, ParameterType type, int count, parElement::Address where,
                            double low, double high, bool required) {
  if (name.empty() || count < 0 || std::holds_alternative<std::monostate>(where)) return 1;
  if (count > 0) {
    const bool null_field = std::visit(
        [](auto p) {
          if constexpr (std::is_same_v<decltype(p), std::monostate>) {
            return true;
          } else if constexpr (std::is_same_v<decltype(p), std::span<char>>) {
            return p.data() == nullptr || p.empty();
          } else {
            return p == nullptr;
          }
        },
        where);
    if (null_field) return 1;
  }
  parElement e;
  e.setElement(name, type, count, where, low, high, required);
  elements_.push_back(std::move(e));
  return 0;
}

int GeneralSAR_BaseXML::addElementInt(std::string_view name, int32_t* field, int count, double low, double high,
                                      bool required) {
  return add(name, kParInt, count, field, low, high, required);
}

int GeneralSAR_BaseXML::addElementInt64(std::string_view name, int64_t* field, int count, double low, double high,
                                        bool required) {
  return add(name, kParInt64, count, field, low, high, required);
}

int GeneralSAR_BaseXML::addElementFloat(std::string_view name, float* field, int count, double low, double high,
                                        bool required) {
  return add(name, kParFloat, count, field, low, high, required);
}

int GeneralSAR_BaseXML::addElementDouble(std::string_view name, double* field, int count, double low, double high,
                                         bool required) {
  return add(name, kParDouble, count, field, low, high, required);
}

int GeneralSAR_BaseXML::addElementString(std::string_view name, std::string* field, bool required) {
  return add(name, kParString, 1, field, 0.0, 0.0, required);
}

int GeneralSAR_BaseXML::addElementString(std::string_view name, std::string* fields, int count, bool required) {
  return add(name, kParString, count, fields, 0.0, 0.0, required);
}

int GeneralSAR_BaseXML::addElementString(std::string_view name, std::span<char> buffer, bool required) {
  return add(name, kParString, 1, buffer, 0.0, 0.0, required);
}

int GeneralSAR_BaseXML::bind() {
  elements_.clear();
  return refreshParameters();
}

const std::vector<parElement>& GeneralSAR_BaseXML::elements() {
  bind();
  return elements_;
}

int GeneralSAR_BaseXML::setAuxiliaryFile(const std::string& path, int channel, std::string_view section) {
  if (path.empty() || channel < 1 || section.empty()) return 1;
  auxPath_ = path;
  channel_ = channel;
  section_ = std::string(section);
  return 0;
}

void GeneralSAR_BaseXML::unsetAuxiliaryFile() {
  auxPath_.clear();
  section_.clear();
  channel_ = 1;
  xml_.clean();
}

void GeneralSAR_BaseXML::getConfigurationFile(std::string& path, int& channel, std::string& section) const {
  path = auxPath_;
  channel = channel_;
  section = section_;
}

int GeneralSAR_BaseXML::readAuxiliaryFile(const std::string& path, int channel, std::string_view section) {
  if (setAuxiliaryFile(path, channel, section) != 0) return 1;
  return readAuxiliaryFile();
}

int GeneralSAR_BaseXML::readAuxiliaryFile() {
  if (auxPath_.empty()) return 1;
  if (bind() != 0) return 1;
  if (xml_.initXmlFile(auxPath_, XmlOpen::kExisting) != XmlOpenResult::kOk) return 1;
  XmlReader reader(xml_, channel_, section_);
  const int status = read_all(elements_, reader, auxPath_, channel_, section_, true);
  xml_.clean();
  return status;
}

int GeneralSAR_BaseXML::writeAuxiliaryFile(const std::string& path, int channel, std::string_view section) {
  if (setAuxiliaryFile(path, channel, section) != 0) return 1;
  return writeAuxiliaryFile();
}

int GeneralSAR_BaseXML::writeAuxiliaryFile() {
  if (auxPath_.empty()) return 1;
  if (bind() != 0) return 1;
  // The document is read from disk at every write, so that objects writing their sections to
  // one header in turn never overwrite each other with a stale copy.
  if (xml_.initXmlFile(auxPath_, XmlOpen::kCreateMissing) != XmlOpenResult::kOk) return 1;
  int status = xml_.removePath(channel_, section_);
  for (const parElement& e : elements_) {
    if (status != 0) break;
    if (e.count <= 0) continue;
    status = write_xml_element(xml_, channel_, join_path(section_, e.name), e);
  }
  if (status == 0) status = xml_.write();
  xml_.clean();
  return status;
}

int GeneralSAR_BaseXML::cleanAuxiliaryFile() {
  if (auxPath_.empty()) return 1;
  if (xml_.initXmlFile(auxPath_, XmlOpen::kExisting) != XmlOpenResult::kOk) return 1;
  int status = xml_.removePath(channel_, section_);
  if (status == 0) status = xml_.write();
  xml_.clean();
  return status;
}

int GeneralSAR_BaseXML::readProfileSection(const std::string& path, std::string_view section) {
  if (path.empty() || section.empty()) return 1;
  if (header_dialect(path) != HeaderDialect::kProfile) return 1;
  if (bind() != 0) return 1;
  ProfileReader reader(path, section);
  return read_all(elements_, reader, path, 1, section, false);
}

int GeneralSAR_BaseXML::writeProfileSection(const std::string& path, std::string_view section) {
  if (path.empty() || section.empty()) return 1;
  const HeaderDialect dialect = header_dialect(path);
  if (dialect != HeaderDialect::kProfile && dialect != HeaderDialect::kMissing) return 1;
  if (bind() != 0) return 1;
  for (const parElement& e : elements_) {
    if (e.count <= 0) continue;
    if (write_profile_element(path, section, e) != 0) return 1;
  }
  return sar::base::SyncProfile(path) == 0 ? 0 : 1;
}

int GeneralSAR_BaseXML::readSection(const std::string& path, int channel, std::string_view section) {
  switch (header_dialect(path)) {
    case HeaderDialect::kXml: return readAuxiliaryFile(path, channel, section);
    case HeaderDialect::kProfile: return readProfileSection(path, section);
    case HeaderDialect::kMissing:
    case HeaderDialect::kOtherXml: break;
  }
  return 1;
}

int GeneralSAR_BaseXML::writeSection(const std::string& path, int channel, std::string_view section) {
  switch (header_dialect(path)) {
    case HeaderDialect::kMissing:
    case HeaderDialect::kXml: return writeAuxiliaryFile(path, channel, section);
    case HeaderDialect::kProfile: return writeProfileSection(path, section);
    case HeaderDialect::kOtherXml: break;
  }
  return 1;
}

}  // namespace sar::metadata

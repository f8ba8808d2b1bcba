#include "metadata/ombrixxml.hpp"

#include <libxml/parser.h>
#include <libxml/tree.h>
#include <libxml/xpath.h>

#include <algorithm>
#include <cctype>
#include <cerrno>
#include <cmath>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <limits>
#include <optional>
#include <system_error>
#include <vector>

#include "base/diagnostics.hpp"
#include "metadata/text_number.hpp"

namespace sar::metadata {

namespace {

constexpr const char* kRoot = "OmbrixXmlDoc";
constexpr const char* kChannels = "NumberOfChannels";
constexpr const char* kDescription = "Description";
constexpr const char* kChannel = "Channel";
constexpr const char* kNumber = "Number";
constexpr const char* kVal = "val";
constexpr const char* kIndex = "N";

const xmlChar* X(const char* s) { return reinterpret_cast<const xmlChar*>(s); }

struct DocDeleter {
  void operator()(xmlDoc* d) const { xmlFreeDoc(d); }
};
struct XPathCtxDeleter {
  void operator()(xmlXPathContext* c) const { xmlXPathFreeContext(c); }
};
struct XPathObjDeleter {
  void operator()(xmlXPathObject* o) const { xmlXPathFreeObject(o); }
};
struct XmlCharDeleter {
  void operator()(xmlChar* p) const { xmlFree(p); }
};
using DocPtr = std::unique_ptr<xmlDoc, DocDeleter>;
using XPathCtxPtr = std::unique_ptr<xmlXPathContext, XPathCtxDeleter>;
using XPathObjPtr = std::unique_ptr<xmlXPathObject, XPathObjDeleter>;
using XmlCharPtr = std::unique_ptr<xmlChar, XmlCharDeleter>;

// libxml2 errors are no business of the caller: a header that does not parse is a plain result.
void silent_structured(void*, xmlErrorPtr) {}

bool is_element(const xmlNode* n, const char* name) {
  return n != nullptr && n->type == XML_ELEMENT_NODE && xmlStrcmp(n->name, X(name)) == 0;
}

xmlNode* first_child_element(xmlNode* parent, const char* name) {
  for (xmlNode* c = parent ? parent->children : nullptr; c != nullptr; c = c->next) {
    if (is_element(c, name)) return c;
  }
  return nullptr;
}

// Path segments become XPath steps and element names, so only XML name characters are allowed;
// anything else is refused rather than interpreted.
bool valid_segment(std::string_view s) {
  if (s.empty()) return false;
  const auto first = static_cast<unsigned char>(s.front());
  if (!(std::isalpha(first) || first == '_')) return false;
  for (char ch : s) {
    const auto c = static_cast<unsigned char>(ch);
    if (!(std::isalnum(c) || c == '_' || c == '-' || c == '.')) return false;
  }
  return true;
}

std::optional<std::vector<std::string>> split_path(std::string_view path) {
  std::vector<std::string> out;
  size_t start = 0;
  while (start <= path.size()) {
    size_t end = path.find('/', start);
    if (end == std::string_view::npos) end = path.size();
    std::string_view seg = path.substr(start, end - start);
    if (!valid_segment(seg)) return std::nullopt;
    out.emplace_back(seg);
    start = end + 1;
  }
  if (out.empty()) return std::nullopt;
  return out;
}

// The element's own text: its direct text and CDATA children, without the text of sub-elements.
std::string own_text(const xmlNode* node) {
  std::string out;
  for (const xmlNode* c = node->children; c != nullptr; c = c->next) {
    if ((c->type == XML_TEXT_NODE || c->type == XML_CDATA_SECTION_NODE) && c->content != nullptr) {
      out += reinterpret_cast<const char*>(c->content);
    }
  }
  return out;
}

std::string full_text(xmlNode* node) {
  XmlCharPtr content(xmlNodeGetContent(node));
  return content ? std::string(reinterpret_cast<const char*>(content.get())) : std::string();
}

// Text that an XML document can hold: control characters other than tab, line feed and carriage
// return become '?', and bytes that are not UTF-8 are taken as Latin-1 and re-encoded. Header
// texts come from product files, and one stray byte must not make the whole header unreadable.
std::string xml_safe_text(std::string_view text) {
  std::string out;
  out.reserve(text.size());
  const auto* p = reinterpret_cast<const unsigned char*>(text.data());
  const size_t n = text.size();
  for (size_t i = 0; i < n;) {
    const unsigned char c = p[i];
    if (c < 0x80) {
      out += (c < 0x20 && c != '\t' && c != '\n' && c != '\r') || c == 0x7F ? '?' : static_cast<char>(c);
      ++i;
      continue;
    }
    size_t len = 0;
    uint32_t cp = 0;
    if (c >= 0xC2 && c <= 0xDF) {
      len = 2;
      cp = c & 0x1Fu;
    } else if (c >= 0xE0 && c <= 0xEF) {
      len = 3;
      cp = c & 0x0Fu;
    } else if (c >= 0xF0 && c <= 0xF4) {
      len = 4;
      cp = c & 0x07u;
    }
    bool valid = len > 0 && i + len <= n;
    for (size_t k = 1; valid && k < len; ++k) {
      if ((p[i + k] & 0xC0u) != 0x80u) valid = false;
      cp = (cp << 6) | (p[i + k] & 0x3Fu);
    }
    // Overlong forms, surrogates, code points beyond Unicode and the two non-characters XML bans.
    if (valid && ((len == 3 && cp < 0x800) || (len == 4 && (cp < 0x10000 || cp > 0x10FFFF)) ||
                  (cp >= 0xD800 && cp <= 0xDFFF) || cp == 0xFFFE || cp == 0xFFFF)) {
      valid = false;
    }
    if (valid) {
      out.append(text.substr(i, len));
      i += len;
    } else {
      out += static_cast<char>(0xC0 | (c >> 6));
      out += static_cast<char>(0x80 | (c & 0x3F));
      ++i;
    }
  }
  return out;
}

XmlCharPtr escaped_text(xmlDoc* doc, std::string_view text) {
  return XmlCharPtr(xmlEncodeSpecialChars(doc, X(xml_safe_text(text).c_str())));
}

void set_text(xmlNode* node, std::string_view text) {
  // Replacing the content also drops <val> children of an earlier vector form.
  xmlNodeSetContent(node, nullptr);
  XmlCharPtr escaped = escaped_text(node->doc, text);
  xmlNodeSetContent(node, escaped.get());
}

std::string format_int(int64_t v) {
  char buf[32];
  std::snprintf(buf, sizeof buf, "%lld", static_cast<long long>(v));
  return buf;
}

std::string format_real(double v) {
  char buf[64];
  std::snprintf(buf, sizeof buf, "%.15g", v);
  return buf;
}

// The texts of `count` values at a node: val children by index, or the node's own text split as
// an older comma list. Empty when not all values are there.
std::optional<std::vector<std::string>> value_texts(xmlNode* node, size_t count, bool split_commas) {
  std::vector<std::optional<std::string>> slots(count);
  bool any_val = false;
  for (xmlNode* c = node->children; c != nullptr; c = c->next) {
    if (!is_element(c, kVal)) continue;
    any_val = true;
    XmlCharPtr attr(xmlGetProp(c, X(kIndex)));
    if (!attr) continue;
    const std::optional<int64_t> index = parse_int(reinterpret_cast<const char*>(attr.get()));
    if (!index || *index < 1 || static_cast<uint64_t>(*index) > count) continue;
    auto& slot = slots[static_cast<size_t>(*index - 1)];
    if (!slot) slot = full_text(c);
  }
  std::vector<std::string> out;
  out.reserve(count);
  if (any_val) {
    for (auto& s : slots) {
      if (!s) return std::nullopt;
      out.push_back(std::move(*s));
    }
    return out;
  }
  const std::string text = own_text(node);
  if (count == 1 && !split_commas) {
    out.push_back(text);
    return out;
  }
  if (count == 1) {
    // A scalar never holds a comma list of its own; a trailing ", " of the old form is tolerated.
    std::vector<std::string> tokens = split_list(text);
    if (tokens.empty()) return std::nullopt;
    out.push_back(tokens.front());
    return out;
  }
  if (!split_commas) return std::nullopt;
  std::vector<std::string> tokens = split_list(text);
  if (tokens.size() < count) return std::nullopt;
  tokens.resize(count);
  return tokens;
}

}  // namespace

struct ombrixxml::Impl {
  DocPtr doc;
  XPathCtxPtr xpath;

  xmlNode* root() const { return doc ? xmlDocGetRootElement(doc.get()) : nullptr; }

  xmlNode* find(int channel, std::string_view path) const {
    if (!doc || channel < 1) return nullptr;
    const auto segs = split_path(path);
    if (!segs) return nullptr;
    std::string expr = "/OmbrixXmlDoc/Channel[@Number=\"" + std::to_string(channel) + "\"]";
    for (const auto& s : *segs) expr += "/" + s;
    XPathObjPtr obj(xmlXPathEvalExpression(X(expr.c_str()), xpath.get()));
    if (!obj || obj->type != XPATH_NODESET || obj->nodesetval == nullptr || obj->nodesetval->nodeNr < 1) {
      return nullptr;
    }
    xmlNode* n = obj->nodesetval->nodeTab[0];
    return (n != nullptr && n->type == XML_ELEMENT_NODE) ? n : nullptr;
  }

  xmlNode* channel_node(int channel, bool create) {
    xmlNode* r = root();
    if (r == nullptr || channel < 1) return nullptr;
    const std::string number = std::to_string(channel);
    for (xmlNode* c = r->children; c != nullptr; c = c->next) {
      if (!is_element(c, kChannel)) continue;
      XmlCharPtr attr(xmlGetProp(c, X(kNumber)));
      if (attr && number == reinterpret_cast<const char*>(attr.get())) return c;
    }
    if (!create) return nullptr;
    xmlNode* ch = xmlNewChild(r, nullptr, X(kChannel), nullptr);
    if (ch == nullptr) return nullptr;
    xmlNewProp(ch, X(kNumber), X(number.c_str()));
    // The channel count follows the highest channel written.
    xmlNode* count = first_child_element(r, kChannels);
    const std::optional<int64_t> current = count ? parse_int(full_text(count)) : std::nullopt;
    if (count != nullptr && (!current || *current < channel)) set_text(count, number);
    return ch;
  }

  xmlNode* find_or_create(int channel, std::string_view path) {
    const auto segs = split_path(path);
    if (!segs) return nullptr;
    xmlNode* node = channel_node(channel, true);
    for (const auto& s : *segs) {
      if (node == nullptr) return nullptr;
      xmlNode* next = first_child_element(node, s.c_str());
      node = next ? next : xmlNewChild(node, nullptr, X(s.c_str()), nullptr);
    }
    return node;
  }

  int put(int channel, std::string_view path, const std::vector<std::string>& texts) {
    if (!doc || texts.empty()) return 1;
    xmlNode* node = find_or_create(channel, path);
    if (node == nullptr) return 1;
    if (texts.size() == 1) {
      set_text(node, texts.front());
      return 0;
    }
    xmlNodeSetContent(node, nullptr);
    for (size_t i = 0; i < texts.size(); ++i) {
      XmlCharPtr escaped = escaped_text(doc.get(), texts[i]);
      xmlNode* v = xmlNewChild(node, nullptr, X(kVal), escaped.get());
      if (v == nullptr) return 1;
      xmlNewProp(v, X(kIndex), X(std::to_string(i + 1).c_str()));
    }
    return 0;
  }

  template <class T, class Parse>
  int get_numbers(int channel, std::string_view path, std::span<T> values, Parse parse) const {
    if (values.empty()) return 0;
    xmlNode* node = find(channel, path);
    if (node == nullptr) return 1;
    const auto texts = value_texts(node, values.size(), true);
    if (!texts) return 1;
    std::vector<T> parsed(values.size());
    for (size_t i = 0; i < values.size(); ++i) {
      const auto v = parse((*texts)[i]);
      if (!v) return 1;
      parsed[i] = *v;
    }
    std::copy(parsed.begin(), parsed.end(), values.begin());
    return 0;
  }
};

ombrixxml::ombrixxml() : impl_(std::make_unique<Impl>()) {}
ombrixxml::~ombrixxml() = default;
ombrixxml::ombrixxml(ombrixxml&&) noexcept = default;
ombrixxml& ombrixxml::operator=(ombrixxml&&) noexcept = default;

XmlOpenResult ombrixxml::initXmlFile(const std::string& path, XmlOpen how) {
  clean();
  xmlInitParser();
  std::error_code ec;
  const bool present = std::filesystem::exists(path, ec);
  if (!present) {
    if (how == XmlOpen::kExisting) return XmlOpenResult::kMissing;
    DocPtr doc(xmlNewDoc(X("1.0")));
    if (!doc) return XmlOpenResult::kNotXml;
    xmlNode* root = xmlNewNode(nullptr, X(kRoot));
    xmlDocSetRootElement(doc.get(), root);
    xmlNewChild(root, nullptr, X(kChannels), X("1"));
    xmlNewChild(root, nullptr, X(kDescription), X(""));
    impl_->doc = std::move(doc);
  } else {
    constexpr int kOptions = XML_PARSE_NONET | XML_PARSE_NOERROR | XML_PARSE_NOWARNING | XML_PARSE_NOBLANKS;
    DocPtr doc(xmlReadFile(path.c_str(), nullptr, kOptions));
    if (!doc) return XmlOpenResult::kNotXml;
    xmlNode* root = xmlDocGetRootElement(doc.get());
    if (!is_element(root, kRoot)) return XmlOpenResult::kNotHeader;
    for (const char* required : {kChannels, kDescription}) {
      if (first_child_element(root, required) == nullptr) {
        if (sar::base::ckflg_report() != 0) {
          std::fprintf(stderr, "File not recognized: /OmbrixXmlDoc/%s does not exist\n", required);
        }
        return XmlOpenResult::kNotHeader;
      }
    }
    impl_->doc = std::move(doc);
  }
  impl_->xpath.reset(xmlXPathNewContext(impl_->doc.get()));
  if (!impl_->xpath) {
    impl_->doc.reset();
    return XmlOpenResult::kNotXml;
  }
  impl_->xpath->error = silent_structured;
  path_ = path;
  return XmlOpenResult::kOk;
}

bool ombrixxml::is_open() const { return impl_->doc != nullptr; }

void ombrixxml::setDescription(std::string_view text) {
  xmlNode* node = first_child_element(impl_->root(), kDescription);
  if (node != nullptr) set_text(node, text);
}

int ombrixxml::readDescription(std::string& text) const {
  xmlNode* node = first_child_element(impl_->root(), kDescription);
  if (node == nullptr) return 1;
  text = full_text(node);
  return 0;
}

int ombrixxml::readNumberOfChannels(int32_t& channels) const {
  xmlNode* node = first_child_element(impl_->root(), kChannels);
  if (node == nullptr) return 1;
  const auto v = parse_int(full_text(node));
  if (!v || *v < 0 || *v > std::numeric_limits<int32_t>::max()) return 1;
  channels = static_cast<int32_t>(*v);
  return 0;
}

int ombrixxml::readInt(int channel, std::string_view path, std::span<int32_t> values) const {
  return impl_->get_numbers(channel, path, values, [](const std::string& t) -> std::optional<int32_t> {
    const auto v = parse_int(t);
    if (!v || *v < std::numeric_limits<int32_t>::min() || *v > std::numeric_limits<int32_t>::max()) {
      return std::nullopt;
    }
    return static_cast<int32_t>(*v);
  });
}

int ombrixxml::readInt64(int channel, std::string_view path, std::span<int64_t> values) const {
  return impl_->get_numbers(channel, path, values, [](const std::string& t) { return parse_int(t); });
}

int ombrixxml::readFloat(int channel, std::string_view path, std::span<float> values) const {
  return impl_->get_numbers(channel, path, values, [](const std::string& t) -> std::optional<float> {
    const auto v = parse_real(t);
    if (!v) return std::nullopt;
    return static_cast<float>(*v);
  });
}

int ombrixxml::readDouble(int channel, std::string_view path, std::span<double> values) const {
  return impl_->get_numbers(channel, path, values, [](const std::string& t) { return parse_real(t); });
}

int ombrixxml::readString(int channel, std::string_view path, std::span<std::string> values) const {
  if (values.empty()) return 0;
  xmlNode* node = impl_->find(channel, path);
  if (node == nullptr) return 1;
  // Strings may hold commas, so they are never split as a list.
  const auto texts = value_texts(node, values.size(), false);
  if (!texts) return 1;
  std::copy(texts->begin(), texts->end(), values.begin());
  return 0;
}

int ombrixxml::writeInt(int channel, std::string_view path, std::span<const int32_t> values) {
  std::vector<std::string> texts;
  for (int32_t v : values) texts.push_back(format_int(v));
  return impl_->put(channel, path, texts);
}

int ombrixxml::writeInt64(int channel, std::string_view path, std::span<const int64_t> values) {
  std::vector<std::string> texts;
  for (int64_t v : values) texts.push_back(format_int(v));
  return impl_->put(channel, path, texts);
}

int ombrixxml::writeFloat(int channel, std::string_view path, std::span<const float> values) {
  std::vector<std::string> texts;
  for (float v : values) texts.push_back(format_real(v));
  return impl_->put(channel, path, texts);
}

int ombrixxml::writeDouble(int channel, std::string_view path, std::span<const double> values) {
  std::vector<std::string> texts;
  for (double v : values) texts.push_back(format_real(v));
  return impl_->put(channel, path, texts);
}

int ombrixxml::writeString(int channel, std::string_view path, std::span<const std::string> values) {
  return impl_->put(channel, path, std::vector<std::string>(values.begin(), values.end()));
}

int ombrixxml::removePath(int channel, std::string_view path) {
  if (!impl_->doc) return 1;
  if (!split_path(path)) return 1;
  // Every match goes, so that a section written twice by an older writer is cleaned up too.
  while (xmlNode* node = impl_->find(channel, path)) {
    xmlUnlinkNode(node);
    xmlFreeNode(node);
  }
  return 0;
}

int ombrixxml::write() {
  if (!impl_->doc || path_.empty()) return 1;
  const std::string tmp = path_ + ".tmp~";
  if (xmlSaveFormatFileEnc(tmp.c_str(), impl_->doc.get(), "UTF-8", 1) < 0) {
    std::remove(tmp.c_str());
    return 1;
  }
  std::error_code ec;
  std::filesystem::rename(tmp, path_, ec);
  if (ec) {
    std::filesystem::remove(tmp, ec);
    return 1;
  }
  return 0;
}

void ombrixxml::clean() {
  impl_->xpath.reset();
  impl_->doc.reset();
  path_.clear();
}

}  // namespace sar::metadata

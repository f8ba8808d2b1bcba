#include "io/description.hpp"

#include <algorithm>
#include <cctype>
#include <cmath>
#include <cstdio>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <limits>
#include <memory>
#include <optional>
#include <sstream>
#include <system_error>

#include <libxml/parser.h>
#include <libxml/tree.h>

#include "base/diagnostics.hpp"
#include "base/profile.hpp"
#include "base/run_services.hpp"
#include "metadata/text_number.hpp"

namespace sar::io {

namespace fs = std::filesystem;

namespace {

// ---- key tables -----------------------------------------------------------------------------

struct BuiltinKeys {
  std::string_view section;
  std::string_view text;
};

// The shipped declarations of the sections that the jobs write, and of their companions in a
// product description.
constexpr BuiltinKeys kBuiltinKeys[] = {
    {"EnvisatDescriptionRecord",
     "ProductName = SCALAR(String)\n"
     "ProductType = SCALAR(String)\n"
     "ProcessingCentre = SCALAR(String)\n"
     "ProcessingTime = SCALAR(String)\n"
     "AbsoluteOrbit = SCALAR(Integer)\n"},
    {"EnvisatFixHeader",
     "SensingStart = SCALAR(String)\n"
     "SensingStop = SCALAR(String)\n"
     "Phase = SCALAR(String)\n"
     "Cycle = SCALAR(Integer)\n"
     "RelativeOrbit = SCALAR(Integer)\n"},
    {"user_defined_section", "UserText = SCALAR(String)\n"},
    {"CartographicSystem",
     "Projection = SCALAR(String)\n"
     "Ellipsoid = SCALAR(String)\n"
     "Datum = SCALAR(String)\n"
     "Zone = SCALAR(Integer)\n"
     "Hemisphere = SCALAR(String)\n"},
    {"RegistrationCoordinates",
     "LatNorthing = SCALAR(Double)\n"
     "LonEasting = SCALAR(Double)\n"
     "PixelSpacingLatNorth = SCALAR(Double)\n"
     "PixelSpacingLonEast = SCALAR(Double)\n"},
    {"DEMCoordinates",
     "NorthingCoordinateBegin = SCALAR(Double)\n"
     "NorthingGridSize = SCALAR(Double)\n"
     "NorthingCoordinateEnd = SCALAR(Double)\n"
     "EastingCoordinateBegin = SCALAR(Double)\n"
     "EastingGridSize = SCALAR(Double)\n"
     "EastingCoordinateEnd = SCALAR(Double)\n"},
    {"orbit_information",
     "OrbitNumber = SCALAR(Integer)\n"
     "PassDirection = SCALAR(String)\n"
     "AscendingNodeTime = SCALAR(String)\n"},
    {"sar_processing",
     "ProcessorName = SCALAR(String)\n"
     "ProcessorVersion = SCALAR(String)\n"
     "ProcessingTime = SCALAR(String)\n"},
    {"interferometric_processing",
     "MasterImage = SCALAR(String)\n"
     "SlaveImage = SCALAR(String)\n"},
    {"PolarimetricCalibrationParameters", "CalibrationMatrix = MATRIX(Double)\n"},
    {"Sensor", "SensorName = SCALAR(String)\n"},
    {"RasterInfo",
     "HeaderOffset = SCALAR(Integer)\n"
     "RowPrefix = SCALAR(Integer)\n"
     "RowSuffix = SCALAR(Integer)\n"
     "CellType = SCALAR(String)\n"
     "DataUnits = SCALAR(String)\n"
     "NullCellValue = SCALAR(Double)\n"
     "NrOfPixelsPerLine = SCALAR(Integer)\n"
     "NrOfLinesPerImage = SCALAR(Integer)\n"
     "BytesOrder = SCALAR(String)\n"
     "OtherInfo = MATRIX(String)\n"},
    {"ChannelInfo",
     "CarrierFrequency = VECTOR(Double)\n"
     "BandWidth = VECTOR(Double)\n"
     "PRF = VECTOR(Double)\n"
     "PRFExtracted = VECTOR(Double)\n"
     "PulseDuration = VECTOR(Double)\n"
     "SamplingRate = VECTOR(Double)\n"
     "Description = VECTOR(String)\n"
     "CalConstProc = SCALAR(Double)\n"
     "RangeLookAngle = SCALAR(Double)\n"
     "IncidenceAngle = SCALAR(Double)\n"
     "EnvisatReferenceElevationAngle = SCALAR(Double)\n"
     "EnvisatTwoWayAntennaElevationPatternTableNbr = SCALAR(Integer)\n"
     "EnvisatTwoWayAntennaElevationPatternTable = VECTOR(Double)\n"},
    {"Processing",
     "NAzimuthLooks = SCALAR(Integer)\n"
     "NRangeLooks = SCALAR(Integer)\n"
     "SlantRange = VECTOR(Double)\n"
     "PixelSpacingRg = SCALAR(Double)\n"
     "PixelSpacingAz = SCALAR(Double)\n"
     "AzimuthTimeStep = SCALAR(Double)\n"
     "FastTime = VECTOR(Double)\n"
     "AzimuthStartTime = SCALAR(String)\n"
     "AzimuthStopTime = SCALAR(String)\n"
     "nDopCenDataSet = SCALAR(Integer)\n"
     "DopCenRefTime = VECTOR(String)\n"
     "DopCenRgRefTime = VECTOR(Double)\n"
     "DopCenPol_nCoeff = VECTOR(Integer)\n"
     "DopCenRangeCoeff = VECTOR(Double)\n"
     "ProcessingVelocity = VECTOR(Double)\n"
     "FromInImageAzimuthLooks = SCALAR(Integer)\n"
     "FromInImageRangeLooks = SCALAR(Integer)\n"
     "SuggestedAzimuthLooks = SCALAR(Integer)\n"
     "SuggestedRangeLooks = SCALAR(Integer)\n"
     "AzimuthGroundPixelSpaceFromSuggestLooks = SCALAR(Double)\n"
     "RangeGroundPixelSpaceFromSuggestLooks = SCALAR(Double)\n"
     "DopRateRefTime = VECTOR(String)\n"
     "DopRateRgRefTime = VECTOR(Double)\n"
     "DopRatePol_nCoeff = VECTOR(Integer)\n"
     "DopRateRangeCoeff = VECTOR(Double)\n"},
    {"InitialGeometry",
     "Projection = SCALAR(String)\n"
     "SceneHeading = SCALAR(Integer)\n"
     "TimeDirectionPixel = SCALAR(String)\n"
     "TimeDirectionLines = SCALAR(String)\n"
     "OrbitConfiguration = SCALAR(String)\n"
     "ReferenceHeight = SCALAR(Integer)\n"},
    {"StateVectorData",
     "StateVectorSource = SCALAR(String)\n"
     "StateVectorReference = SCALAR(String)\n"
     "nStateVectors = SCALAR(Integer)\n"
     "TimeFirst = SCALAR(String)\n"
     "TimeDelta = SCALAR(Double)\n"
     "pos = MATRIX(Double)\n"
     "vel = MATRIX(Double)\n"},
    {"StateVectorCalc",
     "nStateVectors = SCALAR(Integer)\n"
     "TimeFirst = SCALAR(String)\n"
     "TimeDelta = SCALAR(Double)\n"
     "pos = MATRIX(Double)\n"
     "vel = MATRIX(Double)\n"},
    {"OrbitCorrection",
     "AzimuthPixelShift = VECTOR(Double)\n"
     "RangePixelShift = VECTOR(Double)\n"},
    {"Baseline",
     "BaselineParallel = VECTOR(Double)\n"
     "BaselinePerpendicular = VECTOR(Double)\n"},
    {"GCPRasterInfo",
     "NrOfGCPs = SCALAR(Integer)\n"
     "GCPs = MULTIPLE(EFDT) Line(Double) Pixel(Double) Lat(Double) Lon(Double) Height(Double)\n"},
    {"SwathInfo", "Swath = SCALAR(String)\n"},
};

bool is_key_delimiter(char c) {
  return c == ' ' || c == '\t' || c == '=' || c == '(' || c == ')' || c == ',' || c == '\r' || c == '\n';
}

std::vector<std::string> key_tokens(std::string_view line) {
  std::vector<std::string> tokens;
  std::size_t i = 0;
  while (i < line.size()) {
    while (i < line.size() && is_key_delimiter(line[i])) ++i;
    const std::size_t start = i;
    while (i < line.size() && !is_key_delimiter(line[i])) ++i;
    if (i > start) tokens.emplace_back(line.substr(start, i - start));
  }
  return tokens;
}

bool equal_nocase(std::string_view a, std::string_view b) {
  if (a.size() != b.size()) return false;
  for (std::size_t i = 0; i < a.size(); ++i) {
    const auto x = static_cast<unsigned char>(a[i]);
    const auto y = static_cast<unsigned char>(b[i]);
    if (std::tolower(x) != std::tolower(y)) return false;
  }
  return true;
}

std::optional<FieldKind> kind_of(std::string_view word) {
  if (equal_nocase(word, "SCALAR")) return FieldKind::kScalar;
  if (equal_nocase(word, "VECTOR")) return FieldKind::kVector;
  if (equal_nocase(word, "MATRIX") || equal_nocase(word, "MARTIX")) return FieldKind::kMatrix;
  if (equal_nocase(word, "MULTIPLE")) return FieldKind::kMultiple;
  return std::nullopt;
}

std::optional<FieldType> type_of(std::string_view word) {
  if (equal_nocase(word, "Integer")) return FieldType::kInteger;
  if (equal_nocase(word, "Double")) return FieldType::kDouble;
  if (equal_nocase(word, "String")) return FieldType::kString;
  if (equal_nocase(word, "EFDT")) return FieldType::kEfdt;
  return std::nullopt;
}

std::string read_text_file(const std::string& path, bool& found) {
  std::ifstream in(path, std::ios::binary);
  found = static_cast<bool>(in);
  if (!found) return {};
  std::ostringstream content;
  content << in.rdbuf();
  return content.str();
}

std::string dictionary_dir(std::string_view name) {
  const auto value = base::env_lookup(name);
  return value ? *value : std::string();
}

// ---- values ---------------------------------------------------------------------------------

std::string format_double(double v) {
  if (std::isnan(v)) return "NaN";
  char text[64];
  std::snprintf(text, sizeof text, "%.15g", v);
  return text;
}

std::string format_value(const FieldValue& v) {
  if (const auto* i = std::get_if<int64_t>(&v)) return std::to_string(*i);
  if (const auto* d = std::get_if<double>(&v)) return format_double(*d);
  return std::get<std::string>(v);
}

/// A token of a file in the field's type; nullopt when it does not convert.
std::optional<FieldValue> convert(std::string_view token, FieldType type) {
  switch (type) {
    case FieldType::kInteger:
      if (auto i = metadata::parse_int(token)) return FieldValue{*i};
      return std::nullopt;
    case FieldType::kDouble:
      if (auto d = metadata::parse_real(token)) return FieldValue{*d};
      return std::nullopt;
    case FieldType::kString:
    case FieldType::kEfdt:
      break;
  }
  return FieldValue{std::string(token)};
}

bool value_fits(const FieldValue& v, FieldType type) {
  switch (type) {
    case FieldType::kInteger:
      return std::holds_alternative<int64_t>(v);
    case FieldType::kDouble:
      return std::holds_alternative<double>(v) || std::holds_alternative<int64_t>(v);
    case FieldType::kString:
    case FieldType::kEfdt:
      return std::holds_alternative<std::string>(v);
  }
  return false;
}

FieldType element_type(const FieldDecl& d, int column) {
  if (d.kind == FieldKind::kMultiple && column >= 0 && static_cast<std::size_t>(column) < d.subFields.size())
    return d.subFields[static_cast<std::size_t>(column)].type;
  return d.type;
}

void clear_field(DescriptionField& f) {
  f.set = false;
  f.rows = 0;
  f.cols = 0;
  f.values.clear();
}

/// Fills a field from rows of tokens; false (field left unset) when the shape or a value does not
/// fit the declaration.
bool fill_field(DescriptionField& f, const std::vector<std::vector<std::string>>& rows) {
  clear_field(f);
  const FieldDecl& d = f.decl;
  if (rows.empty() || rows.front().empty()) return false;
  std::size_t width = rows.front().size();
  switch (d.kind) {
    case FieldKind::kScalar:
      if (rows.size() != 1) return false;
      width = 1;
      break;
    case FieldKind::kVector:
      if (rows.size() != 1) return false;
      break;
    case FieldKind::kMatrix:
      break;
    case FieldKind::kMultiple:
      if (d.subFields.empty() || width != d.subFields.size()) return false;
      break;
  }
  for (const auto& row : rows) {
    if (d.kind != FieldKind::kScalar && row.size() != width) return false;
    for (std::size_t c = 0; c < width; ++c) {
      auto v = convert(row[c], element_type(d, static_cast<int>(c)));
      if (!v) return false;
      f.values.push_back(std::move(*v));
    }
  }
  f.rows = static_cast<int>(rows.size());
  f.cols = static_cast<int>(width);
  f.set = true;
  return true;
}

// ---- profile text values ----------------------------------------------------------------------

/// Tokens of one row of a profile value: inside braces, quoted strings and bare words; without
/// braces the whole value (quotes around it removed).
std::vector<std::string> profile_row_tokens(std::string_view row) {
  std::vector<std::string> tokens;
  std::size_t i = 0;
  while (i < row.size() && (row[i] == ' ' || row[i] == '\t')) ++i;
  if (i >= row.size() || row[i] != '{') {
    std::string_view v = row.substr(std::min(i, row.size()));
    while (!v.empty() && (v.back() == ' ' || v.back() == '\t' || v.back() == '\r')) v.remove_suffix(1);
    if (v.size() >= 2 && v.front() == '"' && v.back() == '"') v = v.substr(1, v.size() - 2);
    tokens.emplace_back(v);
    return tokens;
  }
  ++i;
  while (i < row.size()) {
    const char c = row[i];
    if (c == ' ' || c == '\t' || c == '\r') {
      ++i;
    } else if (c == '}') {
      break;
    } else if (c == '"') {
      const std::size_t close = row.find('"', i + 1);
      if (close == std::string_view::npos) {
        tokens.emplace_back(row.substr(i + 1));
        break;
      }
      tokens.emplace_back(row.substr(i + 1, close - i - 1));
      i = close + 1;
    } else {
      const std::size_t start = i;
      while (i < row.size() && row[i] != ' ' && row[i] != '\t' && row[i] != '}' && row[i] != '\r') ++i;
      tokens.emplace_back(row.substr(start, i - start));
    }
  }
  return tokens;
}

std::vector<std::vector<std::string>> profile_rows(std::string_view text) {
  std::vector<std::vector<std::string>> rows;
  std::size_t pos = 0;
  for (;;) {
    const std::size_t nl = text.find('\n', pos);
    const std::string_view row = text.substr(pos, nl == std::string_view::npos ? std::string_view::npos : nl - pos);
    rows.push_back(profile_row_tokens(row));
    if (nl == std::string_view::npos) break;
    pos = nl + 1;
  }
  return rows;
}

// ---- XML ------------------------------------------------------------------------------------

struct XmlNode {
  std::string name;
  std::vector<std::pair<std::string, std::string>> attributes;
  std::string text;
  std::vector<XmlNode> children;

  std::string_view local_name() const {
    const auto colon = name.find(':');
    return colon == std::string::npos ? std::string_view(name) : std::string_view(name).substr(colon + 1);
  }
  const XmlNode* child(std::string_view n) const {
    for (const auto& c : children)
      if (c.local_name() == n) return &c;
    return nullptr;
  }
  const XmlNode* child_prefixed(std::string_view prefix) const {
    for (const auto& c : children)
      if (c.local_name().substr(0, prefix.size()) == prefix) return &c;
    return nullptr;
  }
};

/// The XML of a description through libxml2: no network, no DTD subset, no entities of the
/// document's own, nesting bounded. libxml2's diagnostics stay off the error stream; the first
/// error is kept as "<message> at line <n>".
constexpr int kMaxXmlDepth = 64;

struct DocFree {
  void operator()(xmlDoc* d) const { xmlFreeDoc(d); }
};
struct ContextFree {
  void operator()(xmlParserCtxt* c) const { xmlFreeParserCtxt(c); }
};

std::string qualified(const xmlNs* ns, const xmlChar* name) {
  std::string out;
  if (ns && ns->prefix) out = std::string(reinterpret_cast<const char*>(ns->prefix)) + ":";
  return out + reinterpret_cast<const char*>(name);
}

bool convert_element(const xmlNode* from, XmlNode& to, int depth, std::string& error) {
  if (depth > kMaxXmlDepth) {
    error = "elements nested too deep at line " + std::to_string(xmlGetLineNo(from)) + "\n";
    return false;
  }
  to.name = qualified(from->ns, from->name);
  for (const xmlNs* ns = from->nsDef; ns; ns = ns->next)
    to.attributes.emplace_back(ns->prefix ? "xmlns:" + std::string(reinterpret_cast<const char*>(ns->prefix)) : "xmlns",
                               ns->href ? reinterpret_cast<const char*>(ns->href) : "");
  for (const xmlAttr* a = from->properties; a; a = a->next) {
    xmlChar* value = xmlNodeListGetString(from->doc, a->children, 1);
    to.attributes.emplace_back(qualified(a->ns, a->name), value ? reinterpret_cast<const char*>(value) : "");
    xmlFree(value);
  }
  for (const xmlNode* c = from->children; c; c = c->next) {
    if (c->type == XML_TEXT_NODE || c->type == XML_CDATA_SECTION_NODE) {
      if (c->content) to.text += reinterpret_cast<const char*>(c->content);
    } else if (c->type == XML_ELEMENT_NODE) {
      to.children.emplace_back();
      if (!convert_element(c, to.children.back(), depth + 1, error)) return false;
    }
  }
  return true;
}

bool parse_xml_text(const std::string& text, XmlNode& root, std::string& error) {
  constexpr int kOptions = XML_PARSE_NONET | XML_PARSE_NOERROR | XML_PARSE_NOWARNING;
  std::unique_ptr<xmlParserCtxt, ContextFree> context(xmlNewParserCtxt());
  if (!context) {
    error = "no XML parser\n";
    return false;
  }
  std::unique_ptr<xmlDoc, DocFree> doc(xmlCtxtReadMemory(context.get(), text.data(), static_cast<int>(text.size()),
                                                         nullptr, nullptr, kOptions));
  if (!doc || !context->wellFormed) {
    const xmlError* e = xmlCtxtGetLastError(context.get());
    std::string message = e && e->message ? e->message : "not well-formed";
    while (!message.empty() && (message.back() == '\n' || message.back() == ' ')) message.pop_back();
    error = message + " at line " + std::to_string(e ? e->line : 0) + "\n";
    return false;
  }
  if (doc->intSubset && doc->intSubset->children) {
    error = "document type with an internal subset at line 1\n";
    return false;
  }
  const xmlNode* top = xmlDocGetRootElement(doc.get());
  if (!top) {
    error = "no root element at line 1\n";
    return false;
  }
  return convert_element(top, root, 0, error);
}

/// The parser placeholders of the host's older documents.
std::string replace_placeholders(std::string text) {
  static constexpr std::pair<std::string_view, char> kPlaceholders[] = {
      {"##quot", '"'}, {"##apos", '\''}, {"##amp", '&'}, {"##lt", '<'}, {"##gt", '>'}};
  if (text.find("##") == std::string::npos) return text;
  std::string out;
  out.reserve(text.size());
  for (std::size_t i = 0; i < text.size();) {
    bool replaced = false;
    for (const auto& [word, c] : kPlaceholders) {
      if (text.compare(i, word.size(), word) == 0) {
        out += c;
        i += word.size();
        replaced = true;
        break;
      }
    }
    if (!replaced) out += text[i++];
  }
  return out;
}

std::string trimmed(std::string_view v) {
  while (!v.empty() && std::isspace(static_cast<unsigned char>(v.front()))) v.remove_prefix(1);
  while (!v.empty() && std::isspace(static_cast<unsigned char>(v.back()))) v.remove_suffix(1);
  return std::string(v);
}

/// Text of a value element in the element's type: strings as written, numbers trimmed.
std::string value_text(const XmlNode& n, FieldType type) {
  std::string t = replace_placeholders(n.text);
  return type == FieldType::kString || type == FieldType::kEfdt ? t : trimmed(t);
}

std::vector<const XmlNode*> children_prefixed(const XmlNode& n, std::string_view prefix) {
  std::vector<const XmlNode*> out;
  for (const auto& c : n.children)
    if (c.local_name().substr(0, prefix.size()) == prefix) out.push_back(&c);
  return out;
}

/// Reads one field element into rows of tokens; false when it holds no usable value.
bool xml_field_rows(const XmlNode& e, const FieldDecl& d, std::vector<std::vector<std::string>>& rows) {
  if (e.children.empty() && trimmed(e.text) == kEmptyFieldText) return false;
  switch (d.kind) {
    case FieldKind::kScalar:
      if (!e.children.empty()) return false;
      rows.push_back({value_text(e, d.type)});
      return true;
    case FieldKind::kVector: {
      const XmlNode* v = e.child_prefixed("Vector");
      if (!v) return false;
      std::vector<std::string> row;
      for (const XmlNode* x : children_prefixed(*v, "Value")) row.push_back(value_text(*x, d.type));
      rows.push_back(std::move(row));
      return true;
    }
    case FieldKind::kMatrix: {
      const XmlNode* m = e.child_prefixed("Matrix");
      if (!m) return false;
      for (const XmlNode* r : children_prefixed(*m, "MatrixRow")) {
        std::vector<std::string> row;
        for (const XmlNode* x : children_prefixed(*r, "Value")) row.push_back(value_text(*x, d.type));
        rows.push_back(std::move(row));
      }
      return true;
    }
    case FieldKind::kMultiple: {
      const XmlNode* v = e.child("VectorOfStructs");
      const XmlNode* values = v ? v->child("VectorOfStructsValues") : nullptr;
      if (!values) return false;
      for (const XmlNode* s : children_prefixed(*values, "Struct")) {
        std::vector<std::string> row;
        for (const auto& sub : d.subFields) {
          const std::string tag = d.name + "_" + sub.name;
          const XmlNode* x = s->child(tag);
          if (!x) return false;
          row.push_back(value_text(*x, sub.type));
        }
        rows.push_back(std::move(row));
      }
      return true;
    }
  }
  return false;
}

// ---- XML writing ----------------------------------------------------------------------------

std::string escaped(std::string_view text) {
  std::string out;
  out.reserve(text.size());
  for (char c : text) {
    switch (c) {
      case '&':
        out += "&amp;";
        break;
      case '<':
        out += "&lt;";
        break;
      case '>':
        out += "&gt;";
        break;
      case '"':
        out += "&quot;";
        break;
      case '\'':
        out += "&apos;";
        break;
      default:
        out += c;
    }
  }
  return out;
}

std::string indent(int level) { return std::string(static_cast<std::size_t>(level) * 3, ' '); }

std::string attribute1(const char* tag, const char* a, int v) {
  char text[256];
  std::snprintf(text, sizeof text, "%s %s = \"%d\"", tag, a, v);
  return text;
}

std::string attribute2(const char* tag, const char* a, int v, const char* b, int w) {
  char text[256];
  std::snprintf(text, sizeof text, "%s %s = \"%d\" %s = \"%d\"", tag, a, v, b, w);
  return text;
}

void write_field(std::string& out, const DescriptionField& f, int level) {
  const FieldDecl& d = f.decl;
  const std::string& tag = d.name;
  if (!f.set) {
    out += indent(level) + "<" + tag + ">" + std::string(kEmptyFieldText) + "</" + tag + ">\n";
    return;
  }
  const std::string typeWord = field_type_word(static_cast<int>(d.type));
  const auto value = [&](int r, int c) {
    return escaped(format_value(
        f.values[static_cast<std::size_t>(r) * static_cast<std::size_t>(f.cols) + static_cast<std::size_t>(c)]));
  };
  switch (d.kind) {
    case FieldKind::kScalar:
      out += indent(level) + "<" + tag + ">" + value(0, 0) + "</" + tag + ">\n";
      return;
    case FieldKind::kVector: {
      const std::string vtag = "Vector" + typeWord;
      const std::string etag = "Value" + typeWord;
      out += indent(level) + "<" + tag + ">\n";
      out += indent(level + 1) + "<" + attribute1(vtag.c_str(), "NumberOfElements", f.cols) + ">\n";
      for (int c = 0; c < f.cols; ++c) {
        out +=
            indent(level + 2) + "<" + attribute1(etag.c_str(), "ID", c + 1) + ">" + value(0, c) + "</" + etag + ">\n";
      }
      out += indent(level + 1) + "</" + vtag + ">\n";
      out += indent(level) + "</" + tag + ">\n";
      return;
    }
    case FieldKind::kMatrix: {
      const std::string mtag = "Matrix" + typeWord;
      const std::string etag = "Value" + typeWord;
      out += indent(level) + "<" + tag + ">\n";
      out +=
          indent(level + 1) + "<" + attribute2(mtag.c_str(), "NumberOfRows", f.rows, "NumberOfColumns", f.cols) + ">\n";
      for (int r = 0; r < f.rows; ++r) {
        out += indent(level + 2) + "<MatrixRow>\n";
        for (int c = 0; c < f.cols; ++c)
          out += indent(level + 3) + "<" + etag + ">" + value(r, c) + "</" + etag + ">\n";
        out += indent(level + 2) + "</MatrixRow>\n";
      }
      out += indent(level + 1) + "</" + mtag + ">\n";
      out += indent(level) + "</" + tag + ">\n";
      return;
    }
    case FieldKind::kMultiple: {
      out += indent(level) + "<" + tag + ">\n";
      out += indent(level + 1) + "<" +
             attribute2("VectorOfStructs", "NumberOfElements", f.rows, "NumberOfFields", f.cols) + ">\n";
      out += indent(level + 2) + "<VectorOfStructsValues>\n";
      for (int r = 0; r < f.rows; ++r) {
        out += indent(level + 3) + "<Struct>\n";
        for (int c = 0; c < f.cols; ++c) {
          char sub[512];
          std::snprintf(sub, sizeof sub, "%s_%s", d.name.c_str(),
                        d.subFields[static_cast<std::size_t>(c)].name.c_str());
          out += indent(level + 4) + "<" + sub + ">" + value(r, c) + "</" + sub + ">\n";
        }
        out += indent(level + 3) + "</Struct>\n";
      }
      out += indent(level + 2) + "</VectorOfStructsValues>\n";
      out += indent(level + 1) + "</VectorOfStructs>\n";
      out += indent(level) + "</" + tag + ">\n";
      return;
    }
  }
}

/// A section kept from an older file, written back as it was read.
void write_node(std::string& out, const XmlNode& n, int level) {
  out += indent(level) + "<" + n.name;
  for (const auto& [name, value] : n.attributes) out += " " + name + " = \"" + escaped(value) + "\"";
  if (n.children.empty()) {
    out += ">" + escaped(n.text) + "</" + n.name + ">\n";
    return;
  }
  out += ">\n";
  for (const auto& c : n.children) write_node(out, c, level + 1);
  out += indent(level) + "</" + n.name + ">\n";
}

bool parse_xml_file(const std::string& path, XmlNode& root, std::string& error) {
  bool found = false;
  const std::string text = read_text_file(path, found);
  if (!found) {
    error = "cannot open " + path;
    return false;
  }
  if (text.size() > static_cast<std::size_t>(std::numeric_limits<int>::max())) {
    error = "description too large: " + path;
    return false;
  }
  if (!parse_xml_text(text, root, error)) return false;
  if (root.local_name() != "HEADER_INFO") {
    error = "not a description document: " + path;
    return false;
  }
  return true;
}

bool ends_with(std::string_view s, std::string_view suffix) {
  return s.size() >= suffix.size() && s.substr(s.size() - suffix.size()) == suffix;
}

bool file_exists(const std::string& path) {
  std::error_code ec;
  return fs::is_regular_file(path, ec);
}

}  // namespace

// ---- words ----------------------------------------------------------------------------------

const char* field_kind_word(int kind) {
  switch (kind) {
    case 0:
      return "SCALAR";
    case 1:
      return "VECTOR";
    case 2:
      return "MARTIX";
    case 3:
      return "MULTIPLE";
    default:
      return "WRONG";
  }
}

const char* field_kind_xml_word(int kind) {
  switch (kind) {
    case 0:
      return "Scalar";
    case 1:
      return "Vector";
    case 2:
      return "Matrix";
    case 3:
      return "Multiple";
    default:
      return "WRONG";
  }
}

const char* field_type_word(int type) {
  switch (type) {
    case 0:
      return "Integer";
    case 1:
      return "Double";
    case 2:
      return "String";
    case 3:
      return "EFDT";
    default:
      return "WRONG";
  }
}

int parse_key_text(std::string_view text, std::vector<FieldDecl>& fields, std::string* error) {
  std::size_t pos = 0;
  int lineNumber = 0;
  while (pos <= text.size()) {
    const std::size_t nl = text.find('\n', pos);
    const std::string_view line = text.substr(pos, nl == std::string_view::npos ? std::string_view::npos : nl - pos);
    pos = nl == std::string_view::npos ? text.size() + 1 : nl + 1;
    ++lineNumber;
    const auto tokens = key_tokens(line);
    if (tokens.empty() || tokens[0][0] == '#' || tokens[0][0] == ';') continue;
    FieldDecl d;
    d.name = tokens[0];
    const auto kind = tokens.size() > 1 ? kind_of(tokens[1]) : std::nullopt;
    const auto type = tokens.size() > 2 ? type_of(tokens[2]) : std::nullopt;
    bool good = kind && type;
    if (good) {
      d.kind = *kind;
      d.type = *type;
      if (d.kind == FieldKind::kMultiple) {
        good = tokens.size() > 3 && (tokens.size() - 3) % 2 == 0;
        for (std::size_t k = 3; good && k + 1 < tokens.size(); k += 2) {
          const auto sub = type_of(tokens[k + 1]);
          if (!sub || *sub == FieldType::kEfdt)
            good = false;
          else
            d.subFields.push_back({tokens[k], *sub});
        }
      } else {
        good = tokens.size() == 3 && d.type != FieldType::kEfdt;
      }
    }
    if (!good) {
      if (error) *error = "line " + std::to_string(lineNumber) + ": " + std::string(line);
      return 1;
    }
    fields.push_back(std::move(d));
  }
  return 0;
}

std::string_view builtin_key_text(std::string_view section) {
  for (const auto& b : kBuiltinKeys)
    if (b.section == section) return b.text;
  return {};
}

bool DescriptionSection::has_data() const {
  return std::any_of(fields.begin(), fields.end(), [](const DescriptionField& f) { return f.set; });
}

std::string description_base(const std::string& path) {
  if (ends_with(path, "_hdr")) return path.substr(0, path.size() - 4);
  if (ends_with(path, ".sml")) return path.substr(0, path.size() - 4);
  return path;
}

// ---- group ----------------------------------------------------------------------------------

CSectionDataGroup::CSectionDataGroup(std::span<const std::string> sectionNames) { build(sectionNames); }

CSectionDataGroup::CSectionDataGroup(std::initializer_list<std::string_view> sectionNames) {
  std::vector<std::string> names;
  for (auto n : sectionNames) names.emplace_back(n);
  build(names);
}

void CSectionDataGroup::build(std::span<const std::string> names) {
  const std::string keyDir = dictionary_dir("VANTERRA_KEY_FILES_DIR");
  const std::string mandatoryDir = dictionary_dir("VANTERRA_MANDATORY_DIR");
  // The first section named ends up last in the file.
  for (auto it = names.rbegin(); it != names.rend(); ++it) {
    const std::string& name = *it;
    DescriptionSection section;
    section.name = name;
    std::vector<FieldDecl> decls;
    bool found = false;
    const std::string keyPath = keyDir + name + ".key";
    std::string keyText = keyDir.empty() ? std::string() : read_text_file(keyPath, found);
    if (!found) {
      const std::string_view builtin = builtin_key_text(name);
      found = !builtin.empty();
      keyText.assign(builtin);
    }
    if (!found) {
      std::printf("Error: missing key file %s\n", keyPath.c_str());
      base::LogPrintf("Error: missing key file %s\n", keyPath.c_str());
      ok_ = false;
      error_ = "missing key file " + keyPath;
      continue;
    }
    std::string parseError;
    if (parse_key_text(keyText, decls, &parseError) != 0) {
      base::LogPrintf("Error: bad key file %s, %s\n", keyPath.c_str(), parseError.c_str());
      ok_ = false;
      error_ = "bad key file " + keyPath + ", " + parseError;
      continue;
    }
    base::TracePrintf("CVTR_DS_MAX_NBR_FIELDS = %d\n", CVTR_DS_MAX_NBR_FIELDS);
    base::TracePrintf("aFieldsNbr = %d\n", static_cast<int>(decls.size()));
    if (decls.size() > static_cast<std::size_t>(CVTR_DS_MAX_NBR_FIELDS)) {
      ok_ = false;
      error_ = "too many fields in section " + name;
      continue;
    }
    for (auto& d : decls) {
      DescriptionField f;
      f.decl = std::move(d);
      section.fields.push_back(std::move(f));
    }
    if (!mandatoryDir.empty()) {
      bool have = false;
      const std::string text = read_text_file(mandatoryDir + name + ".mandatory", have);
      if (have) {
        for (const auto& t : key_tokens(std::string_view(text))) {
          if (t[0] != '#' && t[0] != ';') section.mandatory.push_back(t);
        }
      }
    }
    sections_.push_back(std::move(section));
  }
}

const DescriptionSection* CSectionDataGroup::section(std::string_view name) const {
  for (const auto& s : sections_)
    if (s.name == name) return &s;
  return nullptr;
}

const DescriptionField* CSectionDataGroup::field(std::string_view dotted) const {
  const auto dot = dotted.find('.');
  if (dot == std::string_view::npos) return nullptr;
  const DescriptionSection* s = section(dotted.substr(0, dot));
  if (!s) return nullptr;
  const std::string_view name = dotted.substr(dot + 1);
  for (const auto& f : s->fields)
    if (f.decl.name == name) return &f;
  return nullptr;
}

DescriptionField* CSectionDataGroup::field(std::string_view dotted) {
  return const_cast<DescriptionField*>(static_cast<const CSectionDataGroup*>(this)->field(dotted));
}

int CSectionDataGroup::getInteger(std::string_view dotted, int64_t& value, std::size_t index) const {
  const DescriptionField* f = field(dotted);
  if (!f || !f->set || index >= f->values.size()) return 1;
  const FieldValue& v = f->values[index];
  if (const auto* i = std::get_if<int64_t>(&v)) {
    value = *i;
    return 0;
  }
  if (const auto* s = std::get_if<std::string>(&v)) {
    if (auto i = metadata::parse_int(*s)) {
      value = *i;
      return 0;
    }
  }
  return 1;
}

int CSectionDataGroup::getDouble(std::string_view dotted, double& value, std::size_t index) const {
  const DescriptionField* f = field(dotted);
  if (!f || !f->set || index >= f->values.size()) return 1;
  const FieldValue& v = f->values[index];
  if (const auto* d = std::get_if<double>(&v)) {
    value = *d;
    return 0;
  }
  if (const auto* i = std::get_if<int64_t>(&v)) {
    value = static_cast<double>(*i);
    return 0;
  }
  if (auto d = metadata::parse_real(std::get<std::string>(v))) {
    value = *d;
    return 0;
  }
  return 1;
}

int CSectionDataGroup::getString(std::string_view dotted, std::string& value, std::size_t index) const {
  const DescriptionField* f = field(dotted);
  if (!f || !f->set || index >= f->values.size()) return 1;
  value = format_value(f->values[index]);
  return 0;
}

int CSectionDataGroup::setValues(std::string_view dotted, int rows, int cols, std::vector<FieldValue> values) {
  DescriptionField* f = field(dotted);
  if (!f || rows < 1 || cols < 1 || static_cast<std::size_t>(rows) * static_cast<std::size_t>(cols) != values.size()) {
    return 1;
  }
  const FieldDecl& d = f->decl;
  if ((d.kind == FieldKind::kScalar && (rows != 1 || cols != 1)) || (d.kind == FieldKind::kVector && rows != 1) ||
      (d.kind == FieldKind::kMultiple && static_cast<std::size_t>(cols) != d.subFields.size())) {
    return 1;
  }
  for (std::size_t k = 0; k < values.size(); ++k) {
    const FieldType t = element_type(d, static_cast<int>(k % static_cast<std::size_t>(cols)));
    if (!value_fits(values[k], t)) return 1;
    if (t == FieldType::kDouble) {
      if (const auto* i = std::get_if<int64_t>(&values[k])) values[k] = static_cast<double>(*i);
    }
  }
  f->rows = rows;
  f->cols = cols;
  f->values = std::move(values);
  f->set = true;
  return 0;
}

int CSectionDataGroup::setInteger(std::string_view dotted, int64_t value) { return setValues(dotted, 1, 1, {value}); }
int CSectionDataGroup::setDouble(std::string_view dotted, double value) { return setValues(dotted, 1, 1, {value}); }
int CSectionDataGroup::setString(std::string_view dotted, std::string value) {
  return setValues(dotted, 1, 1, {std::move(value)});
}

int CSectionDataGroup::unset(std::string_view dotted) {
  DescriptionField* f = field(dotted);
  if (!f) return 1;
  clear_field(*f);
  return 0;
}

// ---- reading --------------------------------------------------------------------------------

int CSectionDataGroup::read(const std::string& path, int checkMandatory) {
  if (!ok_) return 1;
  const std::string base = description_base(path);
  std::string file;
  bool xml = false;
  if (file_exists(base + ".sml")) {
    file = base + ".sml";
    xml = true;
  } else if (file_exists(base + "_hdr")) {
    file = base + "_hdr";
  } else if (file_exists(path)) {
    file = path;
    xml = ends_with(path, ".sml");
  } else {
    base::TracePrintf(" Not Found\n");
    base::LogPrintf("\nFile : %s Not Found\n\n", path.c_str());
    return 1;
  }
  for (auto& s : sections_)
    for (auto& f : s.fields) clear_field(f);
  const int status = xml ? readXml(file) : readProfile(file);
  if (status != 0) return status;
  if (!checkMandatory) return 0;
  int missing = 0;
  for (const auto& s : sections_) {
    for (const auto& m : s.mandatory) {
      const auto it =
          std::find_if(s.fields.begin(), s.fields.end(), [&](const DescriptionField& f) { return f.decl.name == m; });
      if (it == s.fields.end() || !it->set) {
        base::LogPrintf("Mandatory Field [%s] is not found in [%s] section\n", m.c_str(), s.name.c_str());
        base::TracePrintf("Mandatory Field [%s] is not found in [%s] section\n", m.c_str(), s.name.c_str());
        missing = 1;
      }
    }
  }
  return missing;
}

int CSectionDataGroup::readProfile(const std::string& file) {
  for (auto& s : sections_) {
    for (auto& f : s.fields) {
      const std::string* text = base::GetSetProfileChar(0, s.name, f.decl.name, {}, file);
      if (!text) continue;
      if (!fill_field(f, profile_rows(*text))) {
        base::TracePrintf("Field [%s] of [%s] section: value does not fit its declaration\n", f.decl.name.c_str(),
                          s.name.c_str());
      }
    }
  }
  return 0;
}

int CSectionDataGroup::readXml(const std::string& file) {
  XmlNode root;
  std::string error;
  if (!parse_xml_file(file, root, error)) {
    base::LogPrintf("%s", error.c_str());
    base::TracePrintf("%s", error.c_str());
    return 1;
  }
  for (auto& s : sections_) {
    const XmlNode* sn = root.child(s.name);
    if (!sn) continue;
    for (auto& f : s.fields) {
      const XmlNode* fn = sn->child(f.decl.name);
      if (!fn) continue;
      std::vector<std::vector<std::string>> rows;
      base::TracePrintf("[%s]  [%s]  [%s]\n", f.decl.name.c_str(), field_kind_xml_word(static_cast<int>(f.decl.kind)),
                        field_type_word(static_cast<int>(f.decl.type)));
      if (xml_field_rows(*fn, f.decl, rows)) fill_field(f, rows);
    }
  }
  return 0;
}

// ---- writing --------------------------------------------------------------------------------

void CSectionDataGroup::completeGeocoding() {
  const DescriptionSection* reg = section("RegistrationCoordinates");
  if (!reg || !reg->has_data()) return;
  double latSpacing = 0.0;
  double lonSpacing = 0.0;
  double lat = 0.0;
  double lon = 0.0;
  int64_t lines = 0;
  int64_t pixels = 0;
  // All inputs or nothing: a half-filled grid would be worse than none.
  if (getDouble("RegistrationCoordinates.PixelSpacingLatNorth", latSpacing) ||
      getDouble("RegistrationCoordinates.PixelSpacingLonEast", lonSpacing) ||
      getInteger("RasterInfo.NrOfLinesPerImage", lines) || getInteger("RasterInfo.NrOfPixelsPerLine", pixels) ||
      getDouble("RegistrationCoordinates.LatNorthing", lat) || getDouble("RegistrationCoordinates.LonEasting", lon)) {
    return;
  }
  if (lines < 1 || pixels < 1) return;
  // Rows run from north to south, columns from west to east.
  setDouble("DEMCoordinates.NorthingCoordinateBegin", lat);
  setDouble("DEMCoordinates.NorthingGridSize", latSpacing);
  setDouble("DEMCoordinates.NorthingCoordinateEnd", lat - latSpacing * static_cast<double>(lines - 1));
  setDouble("DEMCoordinates.EastingCoordinateBegin", lon);
  setDouble("DEMCoordinates.EastingGridSize", lonSpacing);
  setDouble("DEMCoordinates.EastingCoordinateEnd", lon + lonSpacing * static_cast<double>(pixels - 1));
}

int CSectionDataGroup::write(const std::string& path, int keepExisting, int complete) {
  if (!ok_) return 1;
  const std::string target = description_base(path) + ".sml";
  base::TracePrintf("\n\n*********** CSectionDataGroup::write = %s\n", target.c_str());

  std::vector<XmlNode> kept;
  if (keepExisting && file_exists(target)) {
    base::TracePrintf("EXIST FILE READ OLD VALUES writeXML(%s)\n", target.c_str());
    XmlNode old;
    std::string error;
    if (parse_xml_file(target, old, error)) {
      for (auto& n : old.children) {
        const DescriptionSection* s = section(n.local_name());
        if (!s || !s->has_data()) kept.push_back(std::move(n));
      }
    } else {
      base::TracePrintf("%s", error.c_str());
    }
  } else {
    base::TracePrintf("NOT EXIST FILE OLD writeXML(%s)\n", target.c_str());
  }
  if (complete) completeGeocoding();

  // The schema by its name alone: a reader finds it in its own schema folder (or beside the
  // product), and a product folder stays valid wherever it is moved.
  std::string out = "<?xml version=\"1.0\" ?>\n";
  out += "<HEADER_INFO xmlns=\"" + std::string(kDescriptionNamespace) +
         "\" xmlns:xsi=\"http://www.w3.org/2001/XMLSchema-instance\" xsi:schemaLocation=\"" +
         std::string(kDescriptionNamespace) + " " + std::string(kDescriptionSchema) + "\">\n";
  for (const auto& s : sections_) {
    const bool replacedByOld = !s.has_data() && std::any_of(kept.begin(), kept.end(),
                                                            [&](const XmlNode& n) { return n.local_name() == s.name; });
    if (replacedByOld) continue;
    out += indent(1) + "<" + s.name + ">\n";
    for (const auto& f : s.fields) write_field(out, f, 2);
    out += indent(1) + "</" + s.name + ">\n";
  }
  for (const auto& n : kept) write_node(out, n, 1);
  out += "</HEADER_INFO>\n";

  // Through a temporary file, so that a failed write leaves the older description whole.
  const std::string temporary = target + ".tmp";
  bool good = false;
  {
    std::ofstream file(temporary, std::ios::binary | std::ios::trunc);
    if (file) {
      file << out;
      file.flush();
      good = static_cast<bool>(file);
    }
  }
  std::error_code ec;
  if (good) {
    fs::rename(temporary, target, ec);
    good = !ec;
  }
  if (!good) {
    fs::remove(temporary, ec);
    base::LogPrintf("Error while writing parameter file\n");
    base::TracePrintf("Error while writing parameter file\n");
    base::report(base::kReportWarning, "Error while writing parameter file");
    return 1;
  }
  return 0;
}

// ---- dump -----------------------------------------------------------------------------------

void CSectionDataGroup::dump() const {
  if (!base::tracing_on()) return;
  for (const auto& s : sections_) {
    base::TracePrintf("[%s]\n", s.name.c_str());
    for (const auto& f : s.fields) {
      const FieldDecl& d = f.decl;
      base::TracePrintf("[%s]  [%s]  [%s]", d.name.c_str(), field_kind_word(static_cast<int>(d.kind)),
                        field_type_word(static_cast<int>(d.type)));
      if (d.kind == FieldKind::kMultiple)
        base::TracePrintf("[Number of sub fiels : %d]", static_cast<int>(d.subFields.size()));
      if (!f.set) {
        base::TracePrintf(": EMPTY\n");
        continue;
      }
      if (d.kind == FieldKind::kMatrix) base::TracePrintf("[Row Nbr : %d]  [Col Nbr : %d]", f.rows, f.cols);
      if (d.kind == FieldKind::kVector || d.kind == FieldKind::kMultiple)
        base::TracePrintf("[Number of elements : %d]", d.kind == FieldKind::kVector ? f.cols : f.rows);
      for (const auto& v : f.values) {
        if (const auto* i = std::get_if<int64_t>(&v))
          base::TracePrintf("=  %ld", static_cast<long>(*i));
        else if (const auto* x = std::get_if<double>(&v))
          base::TracePrintf("=  %lf", *x);
        else
          base::TracePrintf("=  [%s]", std::get<std::string>(v).c_str());
      }
      base::TracePrintf("\n");
    }
  }
}

}  // namespace sar::io

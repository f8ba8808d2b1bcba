#include "hostlib/footprint.hpp"

#include <unistd.h>

#include <algorithm>
#include <bit>
#include <cctype>
#include <charconv>
#include <cmath>
#include <cstdio>
#include <ctime>
#include <exception>
#include <filesystem>
#include <memory>
#include <optional>
#include <string_view>
#include <system_error>
#include <utility>
#include <vector>

#include "base/diagnostics.hpp"
#include "hostlib/gdal_support.hpp"
#include "io/description.hpp"

namespace sar::hostlib {

namespace {

namespace fs = std::filesystem;

template <class... Args>
std::string printed(const char* format, Args... args) {
  char text[256];
  const int n = std::snprintf(text, sizeof text, format, args...);
  if (n < 0) return {};
  if (static_cast<std::size_t>(n) < sizeof text) return std::string(text, static_cast<std::size_t>(n));
  std::string big(static_cast<std::size_t>(n) + 1, '\0');
  std::snprintf(big.data(), big.size(), format, args...);
  big.resize(static_cast<std::size_t>(n));
  return big;
}

// ---- reading the description -----------------------------------------------------------------

/// Upper case, blanks trimmed and runs of blanks made one: the table's names are matched
/// whatever spacing a writer used ("CORNER POINT 1  X" and "CORNER POINT 1 X" are one name).
std::string normalised_name(std::string_view text) {
  std::string out;
  bool blank = false;
  for (char c : text) {
    if (std::isspace(static_cast<unsigned char>(c))) {
      blank = !out.empty();
      continue;
    }
    if (blank) out += ' ';
    blank = false;
    out += static_cast<char>(std::toupper(static_cast<unsigned char>(c)));
  }
  return out;
}

std::string_view trimmed(std::string_view text) {
  while (!text.empty() && std::isspace(static_cast<unsigned char>(text.front()))) text.remove_prefix(1);
  while (!text.empty() && std::isspace(static_cast<unsigned char>(text.back()))) text.remove_suffix(1);
  return text;
}

/// The whole text as one finite number, or nothing.
std::optional<double> number(std::string_view text) {
  text = trimmed(text);
  if (!text.empty() && text.front() == '+') text.remove_prefix(1);
  if (text.empty()) return std::nullopt;
  double v = 0.0;
  const auto [end, ec] = std::from_chars(text.data(), text.data() + text.size(), v);
  if (ec != std::errc() || end != text.data() + text.size() || !std::isfinite(v)) return std::nullopt;
  return v;
}

/// Name-value view of RasterInfo.OtherInfo: first row names, second row values.
class OtherInfo {
 public:
  explicit OtherInfo(const io::CSectionDataGroup& group) {
    const io::DescriptionField* f = group.field("RasterInfo.OtherInfo");
    if (!f || !f->set || f->rows < 2 || f->cols < 1) return;
    const auto cols = static_cast<std::size_t>(f->cols);
    if (f->values.size() < 2 * cols) return;
    for (std::size_t c = 0; c < cols; ++c) {
      std::string name, value;
      if (group.getString("RasterInfo.OtherInfo", name, c) != 0) continue;
      if (group.getString("RasterInfo.OtherInfo", value, cols + c) != 0) continue;
      entries_.emplace_back(normalised_name(name), std::move(value));
    }
  }
  bool present() const { return !entries_.empty(); }
  std::optional<std::string> find(std::string_view name) const {
    const std::string key = normalised_name(name);
    for (const auto& [n, v] : entries_)
      if (n == key) return v;
    return std::nullopt;
  }

 private:
  std::vector<std::pair<std::string, std::string>> entries_;
};

bool is_empty_text(std::string_view v) {
  v = trimmed(v);
  return v.empty() || v == io::kEmptyFieldText;
}

/// Reads "<prefix> X" and "<prefix> Y" as longitude and latitude; false with `error` set.
bool read_position(const OtherInfo& info, const std::string& prefix, FootprintPoint& p, std::string& error) {
  const auto x = info.find(prefix + " X");
  const auto y = info.find(prefix + " Y");
  if (!x || !y || is_empty_text(*x) || is_empty_text(*y)) {
    error = "the description gives no " + prefix;
    return false;
  }
  const auto lon = number(*x);
  const auto lat = number(*y);
  if (!lon || !lat || std::fabs(*lat) > 90.0 || std::fabs(*lon) > 360.0) {
    error = "the description gives no valid " + prefix + " (\"" + *x + "\", \"" + *y + "\")";
    return false;
  }
  p.latitude = *lat;
  // -180..180, the form every consumer accepts.
  p.longitude = std::remainder(*lon, 360.0);
  return true;
}

// ---- geometry --------------------------------------------------------------------------------

struct LonLat {
  double lon = 0.0;
  double lat = 0.0;
};

/// Twice the signed area of a closed ring in the lon/lat plane: positive counter-clockwise.
double twice_signed_area(const std::vector<LonLat>& ring) {
  double sum = 0.0;
  for (std::size_t i = 0; i + 1 < ring.size(); ++i) sum += ring[i].lon * ring[i + 1].lat - ring[i + 1].lon * ring[i].lat;
  return sum;
}

/// The closed perimeter 1-2-4-3-1 in the wanted turning sense. With `continuous`, longitudes are
/// carried within half a turn of corner 1 so that a ring across the antimeridian stays one piece.
std::vector<LonLat> corner_ring(const Footprint& fp, bool clockwise, bool continuous) {
  constexpr std::size_t kPerimeter[] = {0, 1, 3, 2};
  const double origin = fp.corners[0].longitude;
  std::vector<LonLat> ring;
  for (std::size_t k : kPerimeter) {
    const FootprintPoint& c = fp.corners[k];
    const double lon = continuous ? origin + std::remainder(c.longitude - origin, 360.0) : c.longitude;
    ring.push_back({lon, c.latitude});
  }
  ring.push_back(ring.front());
  // The sense is judged on the continuous ring: the plain one of a scene across the antimeridian
  // spans most of the globe and would turn the other way.
  std::vector<LonLat> judged = ring;
  if (!continuous) {
    for (auto& p : judged) p.lon = origin + std::remainder(p.lon - origin, 360.0);
  }
  const bool isClockwise = twice_signed_area(judged) < 0.0;
  if (isClockwise != clockwise) std::reverse(ring.begin(), ring.end());
  return ring;
}

// ---- text forms ------------------------------------------------------------------------------

/// Text any XML 1.0 writer can carry: control characters and bytes that are not UTF-8 replaced
/// by '?'.
std::string valid_text(std::string_view text) {
  std::string out;
  out.reserve(text.size());
  std::size_t i = 0;
  while (i < text.size()) {
    const auto c = static_cast<unsigned char>(text[i]);
    if (c < 0x80) {
      out += (c < 0x20 && c != '\t' && c != '\n' && c != '\r') || c == 0x7f ? '?' : static_cast<char>(c);
      ++i;
      continue;
    }
    // Multi-byte sequence: length from the lead byte, then continuation bytes, no overlong form,
    // no surrogate, nothing past U+10FFFF.
    std::size_t len = 0;
    uint32_t cp = 0;
    if (c >= 0xc2 && c <= 0xdf) {
      len = 2;
      cp = c & 0x1fu;
    } else if (c >= 0xe0 && c <= 0xef) {
      len = 3;
      cp = c & 0x0fu;
    } else if (c >= 0xf0 && c <= 0xf4) {
      len = 4;
      cp = c & 0x07u;
    }
    bool valid = len != 0 && i + len <= text.size();
    for (std::size_t k = 1; valid && k < len; ++k) {
      const auto cc = static_cast<unsigned char>(text[i + k]);
      valid = (cc & 0xc0u) == 0x80u;
      cp = (cp << 6) | (cc & 0x3fu);
    }
    if (valid) {
      valid = !(len == 3 && cp < 0x800) && !(len == 4 && (cp < 0x10000 || cp > 0x10ffff)) &&
              !(cp >= 0xd800 && cp <= 0xdfff) && cp != 0xfffe && cp != 0xffff;
    }
    if (valid) {
      out.append(text.substr(i, len));
      i += len;
    } else {
      out += '?';
      ++i;
    }
  }
  return out;
}

/// Valid text with the markup characters escaped, for the hand-made GCP document.
std::string xml_text(std::string_view text) {
  std::string out;
  for (char c : valid_text(text)) {
    switch (c) {
      case '&': out += "&amp;"; break;
      case '<': out += "&lt;"; break;
      case '>': out += "&gt;"; break;
      case '"': out += "&quot;"; break;
      case '\'': out += "&apos;"; break;
      default: out += c;
    }
  }
  return out;
}

/// Valid text for the KML writer, which puts text holding markup characters into a CDATA
/// section without splitting a "]]>" inside it: such a sequence would end the section early.
std::string kml_text(std::string_view text) {
  std::string out = valid_text(text);
  for (std::size_t at = out.find("]]>"); at != std::string::npos; at = out.find("]]>", at)) out[at + 2] = '?';
  return out;
}

/// "dd-MMM-yyyy hh:mm:ss[.fraction]" as an xsd:dateTime in UTC, or empty when the text is not
/// of that form.
std::string iso_time(std::string_view text) {
  text = trimmed(text);
  static constexpr std::string_view kMonths[] = {"JAN", "FEB", "MAR", "APR", "MAY", "JUN",
                                                 "JUL", "AUG", "SEP", "OCT", "NOV", "DEC"};
  if (text.size() < 20 || text[2] != '-' || text[6] != '-' || text[11] != ' ' || text[14] != ':' || text[17] != ':')
    return {};
  const auto digits = [&](std::size_t at, std::size_t n, int& value) {
    value = 0;
    for (std::size_t k = at; k < at + n; ++k) {
      if (!std::isdigit(static_cast<unsigned char>(text[k]))) return false;
      value = value * 10 + (text[k] - '0');
    }
    return true;
  };
  int day = 0, year = 0, hour = 0, minute = 0, second = 0;
  if (!digits(0, 2, day) || !digits(7, 4, year) || !digits(12, 2, hour) || !digits(15, 2, minute) ||
      !digits(18, 2, second))
    return {};
  int month = 0;
  const std::string name = normalised_name(text.substr(3, 3));
  for (int m = 0; m < 12; ++m)
    if (name == kMonths[m]) month = m + 1;
  if (month == 0 || day < 1 || day > 31 || hour > 23 || minute > 59 || second > 60) return {};
  std::string fraction;
  if (text.size() > 20) {
    if (text[20] != '.') return {};
    const std::string_view f = text.substr(21);
    if (f.empty() || !std::all_of(f.begin(), f.end(), [](char c) { return std::isdigit(static_cast<unsigned char>(c)); }))
      return {};
    fraction = "." + std::string(f);
  }
  return printed("%04d-%02d-%02dT%02d:%02d:%02d%sZ", year, month, day, hour, minute, second, fraction.c_str());
}

std::string degrees(double v) { return printed("%.8f", v); }

std::string kml_description(const Footprint& fp) {
  std::string description = "Product " + fp.productName;
  if (!fp.sensorName.empty()) description += ", sensor " + fp.sensorName;
  if (!fp.acquisitionTime.empty()) description += ", acquired " + fp.acquisitionTime;
  description += printed(", %lld lines x %lld pixels", static_cast<long long>(fp.lines),
                         static_cast<long long>(fp.pixels));
  return description;
}

std::string gcp_element(int id, const char* name, const char* position, const FootprintPoint& p) {
  return printed("      <GCP ID=\"%d\" Name=\"%s\" Position=\"%s\" Line=\"%.1f\" Pixel=\"%.1f\" Latitude=\"%s\" "
                 "Longitude=\"%s\"/>\n",
                 id, name, position, p.line, p.pixel, degrees(p.latitude).c_str(), degrees(p.longitude).c_str());
}

std::string xml_document(const Footprint& fp) {
  std::string x;
  x += "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n";
  x += "<SceneFootprint Product=\"" + xml_text(fp.productName) + "\">\n";
  x += "   <Sensor>" + xml_text(fp.sensorName) + "</Sensor>\n";
  x += "   <AcquisitionTime>" + xml_text(fp.acquisitionTime) + "</AcquisitionTime>\n";
  x += printed("   <Lines>%lld</Lines>\n", static_cast<long long>(fp.lines));
  x += printed("   <Pixels>%lld</Pixels>\n", static_cast<long long>(fp.pixels));
  x += "   <Datum>WGS84</Datum>\n";
  x += "   <!-- Line and Pixel count from the leading edge of the first line and sample. -->\n";
  x += "   <GroundControlPoints NumberOfPoints=\"5\">\n";
  x += gcp_element(1, "CORNER POINT 1", "NEAR_EARLY", fp.corners[0]);
  x += gcp_element(2, "CORNER POINT 2", "FAR_EARLY", fp.corners[1]);
  x += gcp_element(3, "CORNER POINT 3", "NEAR_LATE", fp.corners[2]);
  x += gcp_element(4, "CORNER POINT 4", "FAR_LATE", fp.corners[3]);
  x += gcp_element(5, "CENTER SCENE POINT", "CENTRE", fp.centre);
  x += "   </GroundControlPoints>\n";
  x += "</SceneFootprint>\n";
  return x;
}

// ---- shapefile -------------------------------------------------------------------------------
// Written by GDAL's shapefile driver into a private folder beside the product, then staged with
// the other companions. No code page is declared: the text attributes are kept to printable
// ASCII, as dBase III readers without one expect.

/// dBase carries no code page here: printable ASCII only.
std::string dbf_text(std::string_view text, std::size_t length) {
  std::string out;
  for (char c : text) {
    if (out.size() == length) break;
    const auto u = static_cast<unsigned char>(c);
    out += u >= 0x20 && u < 0x7f ? c : '?';
  }
  return out;
}

/// One Polygon record (outer ring clockwise, longitudes continuous) and its attributes as
/// `<folder>/<stem>.shp`, `.shx`, `.dbf`, `.prj`. 0, or 1 with `error` set.
int write_shapefile(const Footprint& fp, const std::string& folder, const std::string& stem, std::string& error) {
  gdal::register_drivers();
  const gdal::QuietErrors quiet;
  GDALDriverH driver = GDALGetDriverByName("ESRI Shapefile");
  if (!driver) {
    error = "GDAL has no shapefile driver";
    return 1;
  }
  const std::string shp = folder + "/" + stem + ".shp";
  gdal::Dataset ds(GDALCreate(driver, shp.c_str(), 0, 0, 0, GDT_Unknown, nullptr));
  if (!ds) {
    error = gdal::error_text("cannot create " + shp);
    return 1;
  }
  const gdal::Srs srs = gdal::wgs84();
  const char* const layerOptions[] = {"ENCODING=", "SHPT=POLYGON", nullptr};
  OGRLayerH layer = GDALDatasetCreateLayer(ds.get(), stem.c_str(), srs.get(), wkbPolygon,
                                           const_cast<char**>(layerOptions));
  if (!layer) {
    error = gdal::error_text("cannot create the layer of " + shp);
    return 1;
  }
  struct Field {
    const char* name;
    OGRFieldType type;
    int width, precision;
  };
  constexpr Field kFields[] = {{"NAME", OFTString, 80, 0},      {"SENSOR", OFTString, 32, 0},
                               {"ACQ_TIME", OFTString, 27, 0},  {"LINES", OFTInteger, 10, 0},
                               {"PIXELS", OFTInteger, 10, 0},   {"CENTER_LAT", OFTReal, 13, 6},
                               {"CENTER_LON", OFTReal, 13, 6}};
  for (const Field& f : kFields) {
    std::unique_ptr<void, gdal::FieldDestroy> field(OGR_Fld_Create(f.name, f.type));
    OGR_Fld_SetWidth(field.get(), f.width);
    OGR_Fld_SetPrecision(field.get(), f.precision);
    if (OGR_L_CreateField(layer, field.get(), TRUE) != OGRERR_NONE) {
      error = gdal::error_text(std::string("cannot add the field ") + f.name + " to " + shp);
      return 1;
    }
  }
  std::unique_ptr<void, gdal::FeatureDestroy> feature(OGR_F_Create(OGR_L_GetLayerDefn(layer)));
  OGR_F_SetFieldString(feature.get(), 0, dbf_text(fp.productName, 80).c_str());
  OGR_F_SetFieldString(feature.get(), 1, dbf_text(fp.sensorName, 32).c_str());
  OGR_F_SetFieldString(feature.get(), 2, dbf_text(fp.acquisitionTime, 27).c_str());
  OGR_F_SetFieldInteger64(feature.get(), 3, fp.lines);
  OGR_F_SetFieldInteger64(feature.get(), 4, fp.pixels);
  OGR_F_SetFieldDouble(feature.get(), 5, fp.centre.latitude);
  OGR_F_SetFieldDouble(feature.get(), 6, fp.centre.longitude);
  OGRGeometryH polygon = OGR_G_CreateGeometry(wkbPolygon);
  OGRGeometryH ring = OGR_G_CreateGeometry(wkbLinearRing);
  for (const auto& p : corner_ring(fp, true, true)) OGR_G_AddPoint_2D(ring, p.lon, p.lat);
  OGR_G_AddGeometryDirectly(polygon, ring);
  OGR_F_SetGeometryDirectly(feature.get(), polygon);
  if (OGR_L_CreateFeature(layer, feature.get()) != OGRERR_NONE) {
    error = gdal::error_text("cannot write the footprint record of " + shp);
    return 1;
  }
  feature.reset();
  CPLErrorReset();
  ds.reset();  // the files are complete only once the dataset is closed
  if (CPLGetLastErrorType() >= CE_Failure) {
    error = gdal::error_text("cannot finish " + shp);
    return 1;
  }
  return 0;
}

// ---- KML -------------------------------------------------------------------------------------
// Written by GDAL's LIBKML driver: the document carries the product's name and one style, its
// placemark the name, a description, the acquisition time and the outline clamped to the ground.

/// `<folder>/<stem>.kml` with one Placemark whose Polygon runs counter-clockwise with longitudes
/// in -180..180. 0, or 1 with `error` set.
int write_kml(const Footprint& fp, const std::string& folder, const std::string& stem, std::string& error) {
  gdal::register_drivers();
  const gdal::QuietErrors quiet;
  GDALDriverH driver = GDALGetDriverByName("LIBKML");
  if (!driver) {
    error = "GDAL has no LIBKML driver";
    return 1;
  }
  const std::string kml = folder + "/" + stem + ".kml";
  const std::string documentName = "NAME=" + kml_text(fp.productName);
  const char* const options[] = {documentName.c_str(), nullptr};
  gdal::Dataset ds(GDALCreate(driver, kml.c_str(), 0, 0, 0, GDT_Unknown, const_cast<char**>(options)));
  if (!ds) {
    error = gdal::error_text("cannot create " + kml);
    return 1;
  }
  // Red outline, a quarter-opaque red fill; the driver turns it into the document's Style.
  std::unique_ptr<void, gdal::StyleTableDestroy> styles(OGR_STBL_Create());
  if (!OGR_STBL_AddStyle(styles.get(), "footprint", "PEN(c:#FF0000FF,w:2px);BRUSH(fc:#FF000040)")) {
    error = "cannot set up the style of " + kml;
    return 1;
  }
  GDALDatasetSetStyleTable(ds.get(), styles.get());
  const gdal::Srs srs = gdal::wgs84();
  // A fixed layer name: the product's own could be no valid XML id.
  OGRLayerH layer = GDALDatasetCreateLayer(ds.get(), "scene", srs.get(), wkbPolygon, nullptr);
  if (!srs || !layer) {
    error = gdal::error_text("cannot create the layer of " + kml);
    return 1;
  }
  // The driver maps these field names onto the placemark's own elements.
  struct Field {
    const char* name;
    OGRFieldType type;
  };
  constexpr Field kFields[] = {
      {"name", OFTString}, {"description", OFTString}, {"timestamp", OFTString}, {"tessellate", OFTInteger}};
  for (const Field& f : kFields) {
    std::unique_ptr<void, gdal::FieldDestroy> field(OGR_Fld_Create(f.name, f.type));
    if (OGR_L_CreateField(layer, field.get(), TRUE) != OGRERR_NONE) {
      error = gdal::error_text(std::string("cannot add the field ") + f.name + " to " + kml);
      return 1;
    }
  }
  std::unique_ptr<void, gdal::FeatureDestroy> feature(OGR_F_Create(OGR_L_GetLayerDefn(layer)));
  OGR_F_SetFieldString(feature.get(), 0, kml_text(fp.productName).c_str());
  OGR_F_SetFieldString(feature.get(), 1, kml_text(kml_description(fp)).c_str());
  if (const std::string when = iso_time(fp.acquisitionTime); !when.empty())
    OGR_F_SetFieldString(feature.get(), 2, when.c_str());
  OGR_F_SetFieldInteger(feature.get(), 3, 1);
  OGR_F_SetStyleString(feature.get(), "@footprint");
  OGRGeometryH polygon = OGR_G_CreateGeometry(wkbPolygon);
  OGRGeometryH ring = OGR_G_CreateGeometry(wkbLinearRing);
  for (const auto& p : corner_ring(fp, false, false)) OGR_G_AddPoint_2D(ring, p.lon, p.lat);
  OGR_G_AddGeometryDirectly(polygon, ring);
  OGR_F_SetGeometryDirectly(feature.get(), polygon);
  if (OGR_L_CreateFeature(layer, feature.get()) != OGRERR_NONE) {
    error = gdal::error_text("cannot write the placemark of " + kml);
    return 1;
  }
  feature.reset();
  CPLErrorReset();
  ds.reset();  // the document is written when the dataset is closed
  if (CPLGetLastErrorType() >= CE_Failure) {
    error = gdal::error_text("cannot finish " + kml);
    return 1;
  }
  return 0;
}

/// A private folder beside the product for the GDAL drivers, removed with everything in it.
class ScratchFolder {
 public:
  explicit ScratchFolder(std::string path) : path_(std::move(path)) {}
  ScratchFolder(const ScratchFolder&) = delete;
  ScratchFolder& operator=(const ScratchFolder&) = delete;
  ~ScratchFolder() {
    std::error_code ec;
    fs::remove_all(path_, ec);
  }
  bool create(std::string& error) {
    std::error_code ec;
    if (!fs::create_directory(path_, ec) || ec) {
      error = "cannot create " + path_;
      return false;
    }
    return true;
  }
  const std::string& path() const { return path_; }

 private:
  std::string path_;
};

// ---- staging ---------------------------------------------------------------------------------

struct FileCloser {
  void operator()(std::FILE* f) const { std::fclose(f); }
};

/// Companions written under temporary names and renamed together: a failure anywhere leaves
/// neither temporary files nor part of the new set behind.
class StagedFiles {
 public:
  StagedFiles() = default;
  StagedFiles(const StagedFiles&) = delete;
  StagedFiles& operator=(const StagedFiles&) = delete;
  ~StagedFiles() {
    std::error_code ec;
    for (const auto& e : entries_) fs::remove(e.temporary, ec);
  }

  /// 0, or 1 with `error` set.
  int add(const std::string& target, const std::string& content, std::string& error) {
    const std::string temporary = target + printed(".tmp%ld", static_cast<long>(::getpid()));
    std::unique_ptr<std::FILE, FileCloser> f(std::fopen(temporary.c_str(), "wb"));
    if (!f) {
      error = "cannot create " + temporary;
      return 1;
    }
    // Only what was created here is removed again.
    entries_.push_back({temporary, target});
    const bool written = std::fwrite(content.data(), 1, content.size(), f.get()) == content.size() &&
                         std::fflush(f.get()) == 0;
    const bool closed = std::fclose(f.release()) == 0;
    if (!written || !closed) {
      error = "cannot write " + temporary;
      return 1;
    }
    return 0;
  }

  /// A file already written under a temporary name, renamed with the others.
  void adopt(const std::string& temporary, const std::string& target) { entries_.push_back({temporary, target}); }

  /// Renames every file into place in the order added; on a failure the files already renamed
  /// are removed again. 0, or 1 with `error` set.
  int commit(std::string& error) {
    std::error_code ec;
    for (std::size_t k = 0; k < entries_.size(); ++k) {
      fs::rename(entries_[k].temporary, entries_[k].target, ec);
      if (ec) {
        error = "cannot rename " + entries_[k].temporary + " to " + entries_[k].target + ": " + ec.message();
        std::error_code ignored;
        for (std::size_t j = 0; j < k; ++j) fs::remove(entries_[j].target, ignored);
        return 1;
      }
    }
    entries_.clear();
    return 0;
  }

 private:
  struct Entry {
    std::string temporary;
    std::string target;
  };
  std::vector<Entry> entries_;
};

void warn(const std::string& text) { base::report(base::kReportWarning, text); }

}  // namespace

int read_footprint(const std::string& slcPath, Footprint& footprint, std::string& error) {
  const std::string base = io::description_base(slcPath);
  std::error_code ec;
  std::string description;
  for (const char* suffix : {".sml", "_hdr"}) {
    if (fs::is_regular_file(base + suffix, ec)) {
      description = base + suffix;
      break;
    }
  }
  // Only the two description forms: the product itself must never be parsed as one.
  if (description.empty()) {
    error = "no description " + base + ".sml or " + base + "_hdr";
    return kFootprintRejected;
  }
  io::CSectionDataGroup group{"RasterInfo", "Sensor"};
  if (!group.ok()) {
    error = "cannot set up the description reader: " + group.error();
    return kFootprintRejected;
  }
  if (group.read(description, 0) != 0) {
    error = "cannot read the description " + description;
    return kFootprintRejected;
  }

  Footprint fp;
  fp.productName = fs::path(base).filename().string();
  if (group.getString("Sensor.SensorName", fp.sensorName) != 0) fp.sensorName.clear();
  if (group.getInteger("RasterInfo.NrOfLinesPerImage", fp.lines) != 0 ||
      group.getInteger("RasterInfo.NrOfPixelsPerLine", fp.pixels) != 0 || fp.lines < 1 || fp.pixels < 1 ||
      fp.lines > INT32_MAX || fp.pixels > INT32_MAX) {
    error = "the description " + description + " gives no valid image size";
    return kFootprintRejected;
  }
  const OtherInfo info(group);
  if (!info.present()) {
    error = "the description " + description + " has no RasterInfo.OtherInfo table";
    return kFootprintRejected;
  }
  for (int k = 0; k < 4; ++k) {
    if (!read_position(info, printed("CORNER POINT %d", k + 1), fp.corners[static_cast<std::size_t>(k)], error)) {
      error += " in " + description;
      return kFootprintRejected;
    }
  }
  if (!read_position(info, "CENTER SCENE POINT", fp.centre, error)) {
    error += " in " + description;
    return kFootprintRejected;
  }
  if (const auto t = info.find("ACQUISITION_TIME"); t && !is_empty_text(*t)) fp.acquisitionTime = trimmed(*t);

  const auto L = static_cast<double>(fp.lines);
  const auto P = static_cast<double>(fp.pixels);
  const double at[4][2] = {{0.0, 0.0}, {0.0, P}, {L, 0.0}, {L, P}};
  for (std::size_t k = 0; k < 4; ++k) {
    fp.corners[k].line = at[k][0];
    fp.corners[k].pixel = at[k][1];
  }
  fp.centre.line = 0.5 * L;
  fp.centre.pixel = 0.5 * P;

  // Corners on one point or one line leave no polygon to draw.
  const double area = std::fabs(twice_signed_area(corner_ring(fp, true, true)));
  if (!(area > 1e-12)) {
    error = "the corners of " + description + " enclose no area";
    return kFootprintRejected;
  }
  footprint = std::move(fp);
  return 0;
}

int write_footprint(const std::string& slcPath, int flag) {
  try {
    if (flag != kFootprintAllFiles) {
      warn(printed("Footprint of %s: unknown request %d", slcPath.c_str(), flag));
      return kFootprintRejected;
    }
    Footprint fp;
    std::string error;
    if (int st = read_footprint(slcPath, fp, error); st != 0) {
      warn("Footprint of " + slcPath + " not written: " + error);
      return st;
    }
    const std::string base = io::description_base(slcPath);
    const fs::path basePath(base);
    const std::string stem = basePath.filename().string();
    ScratchFolder scratch((basePath.parent_path() / ("." + stem + printed(".gis.tmp%ld", static_cast<long>(::getpid()))))
                              .string());
    StagedFiles staged;
    if (staged.add(base + ".xml", xml_document(fp), error) != 0) {
      warn("Footprint of " + slcPath + " not written: " + error);
      return kFootprintWriteFailed;
    }
    if (!scratch.create(error) || write_kml(fp, scratch.path(), stem, error) != 0 ||
        write_shapefile(fp, scratch.path(), stem, error) != 0) {
      warn("Footprint of " + slcPath + " not written: " + error);
      return kFootprintWriteFailed;
    }
    staged.adopt(scratch.path() + "/" + stem + ".kml", base + ".kml");
    // The shapefile's main file goes last, so that whoever sees it finds its companions there.
    for (const char* suffix : {".prj", ".dbf", ".shx", ".shp"})
      staged.adopt(scratch.path() + "/" + stem + suffix, base + suffix);
    if (staged.commit(error) != 0) {
      warn("Footprint of " + slcPath + " not written: " + error);
      return kFootprintWriteFailed;
    }
    return 0;
  } catch (const std::exception& e) {
    warn("Footprint of " + slcPath + " not written: " + e.what());
    return kFootprintWriteFailed;
  }
}

}  // namespace sar::hostlib

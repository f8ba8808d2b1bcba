// Footprint companions: the shapefile bytes and their ring sense, the KML and XML as libxml2
// reads them, GDAL's view of the shapefile, and refusals that leave nothing behind.
#include <gtest/gtest.h>
#include <libxml/parser.h>
#include <libxml/tree.h>
#include <libxml/xpath.h>
#include <libxml/xpathInternals.h>
#include <unistd.h>

#include <array>
#include <bit>
#include <cmath>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <map>
#include <memory>
#include <optional>
#include <set>
#include <sstream>
#include <string>
#include <vector>

#include "base/profile.hpp"
#include "hostlib/footprint.hpp"
#include "io/description.hpp"

namespace fs = std::filesystem;
using namespace sar::hostlib;

namespace {

struct Scene {
  const char* label;
  std::array<std::array<double, 2>, 4> corners;  // {lon, lat} of corners 1..4
  std::array<double, 2> centre;
};

// Right-looking descending pass (1-2-4-3 turns counter-clockwise), its left-looking mirror
// (clockwise), and a scene across the antimeridian.
const Scene kScenes[] = {
    {"descending", {{{12.4, 46.1}, {11.2, 45.9}, {12.1, 45.0}, {10.9, 44.8}}}, {11.65, 45.45}},
    {"mirrored", {{{11.2, 45.9}, {12.4, 46.1}, {10.9, 44.8}, {12.1, 45.0}}}, {11.65, 45.45}},
    {"antimeridian", {{{179.8, -16.0}, {-179.7, -16.2}, {179.6, -17.0}, {-179.9, -17.2}}}, {179.95, -16.6}},
};
constexpr int kLines = 27000;
constexpr int kPixels = 5174;
constexpr const char* kTime = "12-MAR-2004 10:11:12.123456";

std::string text6(double v) {
  char t[64];
  std::snprintf(t, sizeof t, "%.6f", v);
  return t;
}

/// Name -> value of the OtherInfo table as the annotation writes it.
std::map<std::string, std::string> other_info(const Scene& s) {
  std::map<std::string, std::string> m{{"SOFTWARE", "WSfocuser v1.0"}, {"ACQUISITION_TIME", kTime}};
  for (int k = 0; k < 4; ++k) {
    const std::string n = "CORNER POINT " + std::to_string(k + 1) + "  ";
    m[n + "X"] = text6(s.corners[static_cast<std::size_t>(k)][0]);
    m[n + "Y"] = text6(s.corners[static_cast<std::size_t>(k)][1]);
  }
  m["CENTER SCENE POINT X"] = text6(s.centre[0]);
  m["CENTER SCENE POINT Y"] = text6(s.centre[1]);
  return m;
}

/// Writes "<base>_hdr" through the profile writers; with `sml` converts it to "<base>.sml" and
/// removes the profile text. An empty table leaves OtherInfo out.
void write_description(const std::string& base, const std::map<std::string, std::string>& info, bool sml,
                       int lines = kLines) {
  using namespace sar::base;
  const std::string f = base + "_hdr";
  FreeProfile(f);
  WriteMyProfileInt("RasterInfo", "NrOfPixelsPerLine", kPixels, f);
  WriteMyProfileInt("RasterInfo", "NrOfLinesPerImage", lines, f);
  WriteMyProfileStringQuote("Sensor", "SensorName", "ENVISAT-1", f);
  if (!info.empty()) {
    std::vector<std::string> table;
    for (const auto& [n, v] : info) table.push_back(n);
    for (const auto& [n, v] : info) table.push_back(v);
    WriteMyProfileStringMatrix("RasterInfo", "OtherInfo", table, 2, static_cast<int>(info.size()), f);
  }
  ASSERT_EQ(SyncProfile(f), 0);
  FreeProfile(f);
  if (!sml) return;
  sar::io::CSectionDataGroup group{"RasterInfo", "Sensor"};
  ASSERT_EQ(group.read(f, 0), 0);
  ASSERT_EQ(group.write(f, 0, 0), 0);
  fs::remove(f);
}

std::string slurp(const std::string& path) {
  std::ifstream in(path, std::ios::binary);
  std::ostringstream s;
  s << in.rdbuf();
  return s.str();
}

uint32_t be32(const std::string& b, std::size_t at) {
  uint32_t v = 0;
  for (std::size_t k = 0; k < 4; ++k) v = (v << 8) | static_cast<unsigned char>(b.at(at + k));
  return v;
}
uint64_t le(const std::string& b, std::size_t at, std::size_t n) {
  uint64_t v = 0;
  for (std::size_t k = n; k-- > 0;) v = (v << 8) | static_cast<unsigned char>(b.at(at + k));
  return v;
}
double led(const std::string& b, std::size_t at) { return std::bit_cast<double>(le(b, at, 8)); }

using Ring = std::vector<std::array<double, 2>>;

double twice_area(const Ring& r) {
  double s = 0.0;
  for (std::size_t i = 0; i + 1 < r.size(); ++i) s += r[i][0] * r[i + 1][1] - r[i + 1][0] * r[i][1];
  return s;
}

/// Every corner appears in the closed ring once, longitudes compared modulo a turn.
void expect_corners(const Ring& ring, const Scene& s) {
  ASSERT_EQ(ring.size(), 5u);
  EXPECT_EQ(ring.front(), ring.back());
  for (const auto& c : s.corners) {
    int hits = 0;
    for (std::size_t i = 0; i < 4; ++i)
      hits += std::fabs(std::remainder(ring[i][0] - c[0], 360.0)) < 1e-9 && std::fabs(ring[i][1] - c[1]) < 1e-9;
    EXPECT_EQ(hits, 1) << c[0] << "," << c[1];
  }
}

/// String values of what an XPath selects (prefix k for KML); nullopt when not well-formed.
std::optional<std::vector<std::string>> xpath(const std::string& file, const char* expr) {
  std::unique_ptr<xmlDoc, decltype(&xmlFreeDoc)> doc(
      xmlReadFile(file.c_str(), nullptr, XML_PARSE_NONET | XML_PARSE_NOERROR | XML_PARSE_NOWARNING), xmlFreeDoc);
  if (!doc) return std::nullopt;
  std::unique_ptr<xmlXPathContext, decltype(&xmlXPathFreeContext)> ctx(xmlXPathNewContext(doc.get()),
                                                                        xmlXPathFreeContext);
  xmlXPathRegisterNs(ctx.get(), BAD_CAST "k", BAD_CAST "http://www.opengis.net/kml/2.2");
  std::unique_ptr<xmlXPathObject, decltype(&xmlXPathFreeObject)> obj(
      xmlXPathEvalExpression(BAD_CAST expr, ctx.get()), xmlXPathFreeObject);
  std::vector<std::string> out;
  if (obj && obj->nodesetval) {
    for (int i = 0; i < obj->nodesetval->nodeNr; ++i) {
      xmlChar* t = xmlNodeGetContent(obj->nodesetval->nodeTab[i]);
      out.emplace_back(t ? reinterpret_cast<const char*>(t) : "");
      xmlFree(t);
    }
  }
  return out;
}

std::set<std::string> listing(const fs::path& dir) {
  std::set<std::string> names;
  for (const auto& e : fs::directory_iterator(dir)) names.insert(e.path().filename().string());
  return names;
}

class FootprintFiles : public ::testing::Test {
 protected:
  void SetUp() override {
    dir_ = fs::temp_directory_path() /
           ("fp_" + std::to_string(::getpid()) + "_" + ::testing::UnitTest::GetInstance()->current_test_info()->name());
    fs::remove_all(dir_);
    fs::create_directories(dir_);
  }
  void TearDown() override { fs::remove_all(dir_); }
  /// A fresh folder holding the raster "R_slc"; returns the product path.
  std::string product(const std::string& folder, const std::string& name = "R_slc") {
    fs::create_directories(dir_ / folder);
    const std::string slc = (dir_ / folder / name).string();
    std::ofstream(slc, std::ios::binary) << "raster bytes, not a description";
    return slc;
  }
  fs::path dir_;
};

}  // namespace

TEST_F(FootprintFiles, CompanionsCarryTheCornersInTheRightSense) {
  for (const Scene& s : kScenes) {
    for (bool sml : {false, true}) {
      SCOPED_TRACE(std::string(s.label) + (sml ? " .sml" : " _hdr"));
      const std::string slc = product(std::string(s.label) + (sml ? "_sml" : "_hdr"));
      write_description(slc, other_info(s), sml);
      std::ofstream(slc + ".kml") << "stale";  // an older companion is replaced
      ASSERT_EQ(write_footprint(slc, kFootprintAllFiles), 0);
      const std::set<std::string> expected{"R_slc", sml ? "R_slc.sml" : "R_slc_hdr", "R_slc.xml", "R_slc.kml",
                                           "R_slc.shp", "R_slc.shx", "R_slc.dbf", "R_slc.prj"};
      EXPECT_EQ(listing(fs::path(slc).parent_path()), expected);

      // Shapefile: big-endian code and lengths, one clockwise Polygon whose box is the extent.
      const std::string shp = slurp(slc + ".shp"), shx = slurp(slc + ".shx"), dbf = slurp(slc + ".dbf");
      ASSERT_EQ(shp.size(), 100u + 8u + 128u);
      ASSERT_EQ(shx.size(), 108u);
      EXPECT_EQ((std::array{be32(shp, 0), be32(shp, 24), be32(shp, 100), be32(shp, 104), be32(shx, 24), be32(shx, 100),
                            be32(shx, 104)}),
                (std::array<uint32_t, 7>{9994, 118, 1, 64, 54, 50, 64}));
      EXPECT_EQ((std::array{le(shp, 28, 4), le(shp, 32, 4), le(shp, 108, 4), le(shp, 144, 4), le(shp, 148, 4)}),
                (std::array<uint64_t, 5>{1000, 5, 5, 1, 5}));
      Ring ring;
      for (std::size_t i = 0; i < 5; ++i) ring.push_back({led(shp, 156 + 16 * i), led(shp, 164 + 16 * i)});
      expect_corners(ring, s);
      EXPECT_LT(twice_area(ring), 0.0);
      std::array<double, 4> box{1e9, 1e9, -1e9, -1e9};
      for (const auto& p : ring)
        box = {std::min(box[0], p[0]), std::min(box[1], p[1]), std::max(box[2], p[0]), std::max(box[3], p[1])};
      for (std::size_t k = 0; k < 4; ++k) {
        EXPECT_DOUBLE_EQ(led(shp, 36 + 8 * k), box[k]);
        EXPECT_DOUBLE_EQ(led(shp, 112 + 8 * k), box[k]);
        EXPECT_DOUBLE_EQ(led(shx, 36 + 8 * k), box[k]);
      }
      EXPECT_LT(box[2] - box[0], 2.0);  // one piece, also across the antimeridian
      ASSERT_GT(dbf.size(), 12u);
      EXPECT_EQ(dbf[0], 0x03);
      EXPECT_EQ(le(dbf, 4, 4), 1u);                               // one record
      EXPECT_EQ(le(dbf, 8, 2) + le(dbf, 10, 2) + 1, dbf.size());  // header, record, end mark
      EXPECT_NE(slurp(slc + ".prj").find("WGS_1984"), std::string::npos);

      // KML: counter-clockwise, longitudes kept within -180..180, name and time.
      const auto coords = xpath(slc + ".kml", "//k:Placemark/k:Polygon/k:outerBoundaryIs/k:LinearRing/k:coordinates");
      ASSERT_TRUE(coords.has_value());
      ASSERT_EQ(coords->size(), 1u);
      std::istringstream tuples(coords->front());
      Ring kml;
      for (std::string t; tuples >> t;) {
        std::array<double, 3> v{};
        ASSERT_EQ(std::sscanf(t.c_str(), "%lf,%lf,%lf", &v[0], &v[1], &v[2]), 3) << t;
        EXPECT_LE(std::fabs(v[0]), 180.0);
        kml.push_back({v[0], v[1]});
      }
      expect_corners(kml, s);
      Ring continuous = kml;
      for (auto& p : continuous) p[0] = kml[0][0] + std::remainder(p[0] - kml[0][0], 360.0);
      EXPECT_GT(twice_area(continuous), 0.0);
      EXPECT_EQ(xpath(slc + ".kml", "//k:Placemark/k:name"), std::vector<std::string>{"R_slc"});
      EXPECT_EQ(xpath(slc + ".kml", "/k:kml/k:Document/k:name"), std::vector<std::string>{"R_slc"});
      // The placemark's style is the document's one style: a red outline over a faint red fill.
      EXPECT_EQ(xpath(slc + ".kml", "//k:Placemark/k:styleUrl"), std::vector<std::string>{"#footprint"});
      EXPECT_EQ(xpath(slc + ".kml", "//k:Style/@id"), std::vector<std::string>{"footprint"});
      EXPECT_EQ(xpath(slc + ".kml", "//k:Style/k:LineStyle/k:color"), std::vector<std::string>{"ff0000ff"});
      EXPECT_EQ(xpath(slc + ".kml", "//k:Style/k:PolyStyle/k:color"), std::vector<std::string>{"400000ff"});
      EXPECT_EQ(xpath(slc + ".kml", "//k:Placemark/k:Polygon/k:tessellate"), std::vector<std::string>{"1"});
      EXPECT_EQ(xpath(slc + ".kml", "//k:TimeStamp/k:when"), std::vector<std::string>{"2004-03-12T10:11:12.123456Z"});
      const auto description = xpath(slc + ".kml", "//k:Placemark/k:description");
      ASSERT_TRUE(description && description->size() == 1);
      EXPECT_NE(description->front().find(kTime), std::string::npos);

      // XML: the corners and the centre at their image positions.
      const auto lines = xpath(slc + ".xml", "//GCP/@Line");
      const auto pixels = xpath(slc + ".xml", "//GCP/@Pixel");
      const auto lats = xpath(slc + ".xml", "//GCP/@Latitude");
      const auto lons = xpath(slc + ".xml", "//GCP/@Longitude");
      ASSERT_TRUE(lines && pixels && lats && lons);
      ASSERT_EQ(lines->size(), 5u);
      const double at[5][2] = {{0, 0}, {0, kPixels}, {kLines, 0}, {kLines, kPixels}, {kLines / 2.0, kPixels / 2.0}};
      for (std::size_t k = 0; k < 5; ++k) {
        const auto& geo = k < 4 ? s.corners[k] : s.centre;
        EXPECT_DOUBLE_EQ(std::stod(lines->at(k)), at[k][0]);
        EXPECT_DOUBLE_EQ(std::stod(pixels->at(k)), at[k][1]);
        EXPECT_NEAR(std::stod(lats->at(k)), geo[1], 1e-9);
        EXPECT_NEAR(std::stod(lons->at(k)), geo[0], 1e-9);
      }
    }
  }
}

TEST_F(FootprintFiles, GdalReadsOnePolygonWithItsAttributes) {
  if (std::system("ogrinfo --version >/dev/null 2>&1") != 0) GTEST_SKIP() << "ogrinfo not installed";
  const Scene& s = kScenes[0];
  const std::string slc = product("gdal");
  write_description(slc, other_info(s), true);
  ASSERT_EQ(write_footprint(slc, kFootprintAllFiles), 0);
  const auto run = [&](const std::string& file) {
    const std::string out = slc + ".info";
    EXPECT_EQ(std::system(("ogrinfo -ro -al '" + file + "' > '" + out + "' 2>&1").c_str()), 0);
    std::string text = slurp(out);
    fs::remove(out);
    return text;
  };
  const std::string shp = run(slc + ".shp");
  EXPECT_NE(shp.find("Geometry: Polygon"), std::string::npos) << shp;
  EXPECT_NE(shp.find("Feature Count: 1"), std::string::npos) << shp;
  EXPECT_NE(shp.find("Extent: (10.900000, 44.800000) - (12.400000, 46.100000)"), std::string::npos) << shp;
  EXPECT_NE(shp.find("WGS 84"), std::string::npos) << shp;
  for (const char* attribute : {"NAME (String) = R_slc", "SENSOR (String) = ENVISAT-1", ") = 27000", ") = 5174",
                                "ACQ_TIME (String) = 12-MAR-2004 10:11:12.123456", "CENTER_LAT (Real) = 45.45"})
    EXPECT_NE(shp.find(attribute), std::string::npos) << attribute << "\n" << shp;
  EXPECT_NE(shp.find("POLYGON ((12.4 46.1,"), std::string::npos) << shp;
  const std::string kml = run(slc + ".kml");
  EXPECT_NE(kml.find("Feature Count: 1"), std::string::npos) << kml;
  EXPECT_NE(kml.find("Polygon"), std::string::npos) << kml;
}

TEST_F(FootprintFiles, EscapesTheProductNameInEveryForm) {
  const std::string name = "a&b<'c'>\"\x01\xff_slc";
  const std::string slc = product("names", name);
  write_description(slc, other_info(kScenes[0]), true);
  ASSERT_EQ(write_footprint(slc, kFootprintAllFiles), 0);
  const std::string shown = "a&b<'c'>\"??_slc";
  EXPECT_EQ(xpath(slc + ".kml", "//k:Placemark/k:name"), std::vector<std::string>{shown});
  EXPECT_EQ(xpath(slc + ".xml", "/SceneFootprint/@Product"), std::vector<std::string>{shown});
  EXPECT_EQ(slurp(slc + ".dbf").substr(32 * 8 + 2, shown.size()), shown);

  // The KML writer wraps markup in a CDATA section, which a "]]>" in the name would end early.
  const std::string cdata = product("cdata", "x]]>y&_slc");
  write_description(cdata, other_info(kScenes[0]), true);
  ASSERT_EQ(write_footprint(cdata, kFootprintAllFiles), 0);
  EXPECT_EQ(xpath(cdata + ".kml", "//k:Placemark/k:name"), std::vector<std::string>{"x]]?y&_slc"});
  EXPECT_EQ(xpath(cdata + ".xml", "/SceneFootprint/@Product"), std::vector<std::string>{"x]]>y&_slc"});
}

TEST_F(FootprintFiles, RefusalsLeaveNothingBehind) {
  using Changes = std::vector<std::pair<const char*, const char*>>;  // entry, new text (nullptr drops it)
  struct Case {
    const char* label;
    Changes changes;
    int lines = kLines;
    bool noTable = false;
    bool noDescription = false;
    int flag = kFootprintAllFiles;
  };
  const Case cases[] = {
      {"no description", {}, kLines, false, true},
      {"no OtherInfo", {}, kLines, true},
      {"corner 3 Y missing", {{"CORNER POINT 3  Y", nullptr}}},
      {"corner 2 X unset", {{"CORNER POINT 2  X", "IS_EMPTY"}}},
      {"corner 4 X not a number", {{"CORNER POINT 4  X", "12.1abc"}}},
      {"latitude beyond the pole", {{"CORNER POINT 1  Y", "95.0"}}},
      {"centre missing", {{"CENTER SCENE POINT X", nullptr}}},
      {"no lines", {}, 0},
      {"corners on one parallel",
       {{"CORNER POINT 1  Y", "45.9"}, {"CORNER POINT 2  Y", "45.9"}, {"CORNER POINT 3  Y", "45.9"},
        {"CORNER POINT 4  Y", "45.9"}}},
      {"unknown flag", {}, kLines, false, false, 2},
  };
  int n = 0;
  for (const Case& c : cases) {
    SCOPED_TRACE(c.label);
    const std::string slc = product("case" + std::to_string(n++));
    if (!c.noDescription) {
      auto info = other_info(kScenes[0]);
      if (c.noTable) info.clear();
      for (const auto& [entry, value] : c.changes) {
        if (value) info[entry] = value;
        else info.erase(entry);
      }
      write_description(slc, info, false, c.lines);
    }
    const auto before = listing(fs::path(slc).parent_path());
    EXPECT_EQ(write_footprint(slc, c.flag), kFootprintRejected);
    EXPECT_EQ(listing(fs::path(slc).parent_path()), before);
  }
}

TEST_F(FootprintFiles, WriteFailuresLeaveNoPartialSet) {
  // A folder in the place of the main file stops the last rename; one in the place of the first
  // temporary stops the first write.
  const std::string slc = product("rename");
  write_description(slc, other_info(kScenes[0]), true);
  fs::create_directories(slc + ".shp/inside");
  auto before = listing(fs::path(slc).parent_path());
  EXPECT_EQ(write_footprint(slc, kFootprintAllFiles), kFootprintWriteFailed);
  EXPECT_EQ(listing(fs::path(slc).parent_path()), before);

  const std::string other = product("create");
  write_description(other, other_info(kScenes[0]), true);
  fs::create_directories(other + ".xml.tmp" + std::to_string(::getpid()));
  before = listing(fs::path(other).parent_path());
  EXPECT_EQ(write_footprint(other, kFootprintAllFiles), kFootprintWriteFailed);
  EXPECT_EQ(listing(fs::path(other).parent_path()), before);
}

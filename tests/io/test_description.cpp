// Product descriptions: key tables, the XML form and the profile text form, and the rules of
// reading and writing them.
#include <cmath>
#include <cstdlib>
#include <fstream>
#include <string>

#include <gtest/gtest.h>

#include "base/profile.hpp"
#include "io/description.hpp"
#include "io_test_util.hpp"

namespace sar::io::test {
namespace {

std::string slurp_text(const std::string& path) {
  const auto bytes = slurp(path);
  return std::string(bytes.begin(), bytes.end());
}

class DescriptionTest : public TempDirTest {
 protected:
  void TearDown() override {
    base::FreeProfile();
    ::unsetenv("VANTERRA_KEY_FILES_DIR");
    ::unsetenv("VANTERRA_MANDATORY_DIR");
    TempDirTest::TearDown();
  }
  void put(const std::string& name, const std::string& text) { std::ofstream(file(name), std::ios::binary) << text; }
};

TEST(KeyText, DeclaresKindsTypesAndSubFields) {
  std::vector<FieldDecl> f;
  std::string error;
  ASSERT_EQ(parse_key_text("# comment\n"
                           "Lines = SCALAR(Integer)\n"
                           "\n"
                           "Slant\tVECTOR Double\r\n"
                           "Info = MARTIX(String)\n"
                           "Points = MULTIPLE(EFDT) Lat(Double), Lon(Double) Name(String)\n",
                           f, &error),
            0)
      << error;
  ASSERT_EQ(f.size(), 4u);
  EXPECT_EQ(f[0].name, "Lines");
  EXPECT_EQ(f[1].kind, FieldKind::kVector);
  EXPECT_EQ(f[1].type, FieldType::kDouble);
  EXPECT_EQ(f[2].kind, FieldKind::kMatrix);
  ASSERT_EQ(f[3].subFields.size(), 3u);
  EXPECT_EQ(f[3].subFields[2].name, "Name");
  EXPECT_EQ(f[3].subFields[1].type, FieldType::kDouble);

  for (const char* bad : {"X = TENSOR(Double)\n", "X = SCALAR(Float)\n", "X = SCALAR(Double) extra\n",
                          "X = MULTIPLE(EFDT) Lat\n", "X = SCALAR\n"}) {
    std::vector<FieldDecl> g;
    EXPECT_EQ(parse_key_text(bad, g, &error), 1) << bad;
    EXPECT_NE(error.find("line 1"), std::string::npos);
  }
  EXPECT_STREQ(field_kind_word(2), "MARTIX");
  EXPECT_STREQ(field_kind_xml_word(2), "Matrix");
  EXPECT_STREQ(field_type_word(7), "WRONG");
}

TEST_F(DescriptionTest, XmlFormRoundTripsEveryKindWithEscapesNaNAndEmptyFields) {
  CSectionDataGroup g{"RasterInfo", "ChannelInfo", "GCPRasterInfo"};
  ASSERT_TRUE(g.ok());
  ASSERT_EQ(g.setInteger("RasterInfo.NrOfLinesPerImage", 1200), 0);
  ASSERT_EQ(g.setString("RasterInfo.DataUnits", "a \"quoted\" <unit> & 'more'"), 0);
  ASSERT_EQ(g.setDouble("RasterInfo.NullCellValue", std::nan("")), 0);
  ASSERT_EQ(g.setValues("RasterInfo.OtherInfo", 2, 2,
                        {std::string("A"), std::string("B"), std::string(" x "), std::string("")}),
            0);
  ASSERT_EQ(g.setValues("ChannelInfo.PRF", 1, 2, {1652.4156, int64_t{7}}), 0);
  ASSERT_EQ(g.setValues("GCPRasterInfo.GCPs", 2, 5, {1.0, 2.0, 45.5, -3.25, 0.0, 3.0, 4.0, -45.5, 179.0, 10.0}), 0);
  // Wrong types and shapes are refused.
  EXPECT_EQ(g.setDouble("RasterInfo.NrOfLinesPerImage", 1.5), 1);
  EXPECT_EQ(g.setValues("RasterInfo.NrOfLinesPerImage", 1, 2, {int64_t{1}, int64_t{2}}), 1);
  EXPECT_EQ(g.setInteger("RasterInfo.NoSuchField", 1), 1);

  const std::string path = file("scene_slc");
  // The schema folder of the run stays out of the file: the product folder can be moved.
  ::setenv("VANTERRA_XML_SCHEMA_DES_FILES_DIR", "/run/des/", 1);
  const int written = g.write(path);
  ::unsetenv("VANTERRA_XML_SCHEMA_DES_FILES_DIR");
  ASSERT_EQ(written, 0);
  const std::string xml = slurp_text(path + ".sml");
  EXPECT_EQ(xml.rfind("<?xml version=\"1.0\" ?>\n<HEADER_INFO ", 0), 0u);
  EXPECT_NE(xml.find(" xsi:schemaLocation=\"urn:vanterra:header:1.0 VanterraHeaderSchema_version_1.0.xsd\">\n"),
            std::string::npos);
  EXPECT_EQ(xml.find("/run/des/"), std::string::npos);
  EXPECT_NE(xml.find("a &quot;quoted&quot; &lt;unit&gt; &amp; &apos;more&apos;"), std::string::npos);
  EXPECT_NE(xml.find("<NullCellValue>NaN</NullCellValue>"), std::string::npos);
  EXPECT_NE(xml.find("      <RowPrefix>IS_EMPTY</RowPrefix>"), std::string::npos);
  EXPECT_NE(xml.find("<VectorDouble NumberOfElements = \"2\">"), std::string::npos);
  EXPECT_NE(xml.find("<ValueDouble ID = \"2\">7</ValueDouble>"), std::string::npos);
  EXPECT_NE(xml.find("<MatrixString NumberOfRows = \"2\" NumberOfColumns = \"2\">"), std::string::npos);
  EXPECT_NE(xml.find("<VectorOfStructs NumberOfElements = \"2\" NumberOfFields = \"5\">"), std::string::npos);
  EXPECT_NE(xml.find("<GCPs_Lon>179</GCPs_Lon>"), std::string::npos);
  // The first section of the call comes last.
  EXPECT_LT(xml.find("<GCPRasterInfo>"), xml.find("<ChannelInfo>"));
  EXPECT_LT(xml.find("<ChannelInfo>"), xml.find("<RasterInfo>"));

  CSectionDataGroup r{"RasterInfo", "ChannelInfo", "GCPRasterInfo"};
  ASSERT_EQ(r.read(path + ".sml"), 0);
  int64_t lines = 0;
  double v = 0.0;
  std::string s;
  EXPECT_EQ(r.getInteger("RasterInfo.NrOfLinesPerImage", lines), 0);
  EXPECT_EQ(lines, 1200);
  EXPECT_EQ(r.getString("RasterInfo.DataUnits", s), 0);
  EXPECT_EQ(s, "a \"quoted\" <unit> & 'more'");
  EXPECT_EQ(r.getDouble("RasterInfo.NullCellValue", v), 0);
  EXPECT_TRUE(std::isnan(v));
  EXPECT_EQ(r.getString("RasterInfo.OtherInfo", s, 2), 0);
  EXPECT_EQ(s, " x ");
  EXPECT_EQ(r.field("RasterInfo.OtherInfo")->rows, 2);
  EXPECT_FALSE(r.field("RasterInfo.RowPrefix")->set);
  EXPECT_EQ(r.getInteger("RasterInfo.RowPrefix", lines), 1);
  EXPECT_EQ(r.getDouble("ChannelInfo.PRF", v, 0), 0);
  EXPECT_EQ(v, 1652.4156);
  EXPECT_EQ(r.getDouble("GCPRasterInfo.GCPs", v, 8), 0);
  EXPECT_EQ(v, 179.0);
  EXPECT_EQ(r.getDouble("GCPRasterInfo.GCPs", v, 10), 1);
}

TEST_F(DescriptionTest, ProfileFormIsReadWithTheKeyTableAndTheXmlFormWins) {
  put("p_hdr",
      "[RasterInfo]\n"
      "NrOfLinesPerImage = 512\n"
      "CellType = \"FLOAT_COMPLEX\"\n"
      "NullCellValue = not-a-number-text\n"
      "OtherInfo = {\"ORIGIN DATA\" \"UTM_ZONE\"}\n"
      "\t{\"ENVISAT_IM0\" \"32\"}\n"
      "[ChannelInfo]\n"
      "PRF = {1652.4}\n"
      "Description = {\"V/V\"}\n"
      "EnvisatTwoWayAntennaElevationPatternTable = {0 -0.5 -1.25}\n");
  CSectionDataGroup g{"RasterInfo", "ChannelInfo"};
  ASSERT_EQ(g.read(file("p_hdr")), 0);
  int64_t n = 0;
  std::string s;
  double v = 0.0;
  EXPECT_EQ(g.getInteger("RasterInfo.NrOfLinesPerImage", n), 0);
  EXPECT_EQ(n, 512);
  EXPECT_EQ(g.getString("RasterInfo.CellType", s), 0);
  EXPECT_EQ(s, "FLOAT_COMPLEX");
  EXPECT_FALSE(g.field("RasterInfo.NullCellValue")->set);  // does not convert: left unset
  EXPECT_EQ(g.field("RasterInfo.OtherInfo")->rows, 2);
  EXPECT_EQ(g.getString("RasterInfo.OtherInfo", s, 3), 0);
  EXPECT_EQ(s, "32");
  EXPECT_EQ(g.getString("ChannelInfo.Description", s), 0);
  EXPECT_EQ(s, "V/V");
  EXPECT_EQ(g.field("ChannelInfo.EnvisatTwoWayAntennaElevationPatternTable")->cols, 3);
  EXPECT_EQ(g.getDouble("ChannelInfo.EnvisatTwoWayAntennaElevationPatternTable", v, 2), 0);
  EXPECT_EQ(v, -1.25);

  // Once the XML form exists beside it, it is the one read, whichever name is given.
  ASSERT_EQ(g.setInteger("RasterInfo.NrOfLinesPerImage", 77), 0);
  ASSERT_EQ(g.write(file("p_hdr")), 0);
  CSectionDataGroup r{"RasterInfo", "ChannelInfo"};
  ASSERT_EQ(r.read(file("p_hdr")), 0);
  EXPECT_EQ(r.getInteger("RasterInfo.NrOfLinesPerImage", n), 0);
  EXPECT_EQ(n, 77);
  ASSERT_EQ(r.read(file("p")), 0);
  EXPECT_EQ(r.getInteger("RasterInfo.NrOfLinesPerImage", n), 0);
  EXPECT_EQ(n, 77);

  EXPECT_EQ(r.read(file("absent")), 1);
}

TEST_F(DescriptionTest, KeyAndMandatoryFilesComeFromTheirDirectories) {
  std::filesystem::create_directories(dir_ / "keys");
  std::filesystem::create_directories(dir_ / "mandatory");
  put("keys/Custom.key", "Name = SCALAR(String)\nCount = SCALAR(Integer)\n");
  put("mandatory/Custom.mandatory", "Count\n");
  ::setenv("VANTERRA_KEY_FILES_DIR", (dir_ / "keys").c_str(), 1);
  ::setenv("VANTERRA_MANDATORY_DIR", (dir_ / "mandatory").c_str(), 1);

  CSectionDataGroup g{"Custom"};
  ASSERT_TRUE(g.ok());
  put("c_hdr", "[Custom]\nName = x\n");
  EXPECT_EQ(g.read(file("c_hdr")), 1);     // Count is mandatory
  EXPECT_EQ(g.read(file("c_hdr"), 0), 0);  // unless the check is off
  put("d_hdr", "[Custom]\nName = x\nCount = 3\n");
  EXPECT_EQ(g.read(file("d_hdr")), 0);

  // A section with neither key file nor built-in table makes the group unusable.
  testing::internal::CaptureStdout();
  CSectionDataGroup bad{"RasterInfo", "NoSuchSection"};
  const std::string printed = testing::internal::GetCapturedStdout();
  EXPECT_FALSE(bad.ok());
  EXPECT_NE(printed.find("Error: missing key file "), std::string::npos);
  EXPECT_EQ(bad.read(file("d_hdr")), 1);
  EXPECT_EQ(bad.write(file("e")), 1);
}

TEST_F(DescriptionTest, OtherSectionsOfAnOlderDescriptionAreKeptOnlyWhenAsked) {
  put("k.sml",
      "<?xml version=\"1.0\" ?>\n<HEADER_INFO><Footprint><Kind>KML &amp; SHP</Kind></Footprint>"
      "<RasterInfo><NrOfLinesPerImage>5</NrOfLinesPerImage></RasterInfo></HEADER_INFO>\n");
  CSectionDataGroup g{"RasterInfo"};
  ASSERT_EQ(g.setInteger("RasterInfo.NrOfLinesPerImage", 9), 0);
  ASSERT_EQ(g.write(file("k.sml"), 1, 0), 0);
  std::string xml = slurp_text(file("k.sml"));
  EXPECT_NE(xml.find("<Kind>KML &amp; SHP</Kind>"), std::string::npos);
  EXPECT_NE(xml.find("<NrOfLinesPerImage>9<"), std::string::npos);
  EXPECT_EQ(xml.find("<NrOfLinesPerImage>5<"), std::string::npos);

  ASSERT_EQ(g.write(file("k.sml"), 0, 0), 0);
  xml = slurp_text(file("k.sml"));
  EXPECT_EQ(xml.find("Footprint"), std::string::npos);
}

TEST_F(DescriptionTest, GeocodedGridIsCompletedOnlyFromAllItsInputs) {
  CSectionDataGroup g{"RegistrationCoordinates", "DEMCoordinates", "RasterInfo"};
  ASSERT_EQ(g.setDouble("RegistrationCoordinates.LatNorthing", 46.0), 0);
  ASSERT_EQ(g.setDouble("RegistrationCoordinates.LonEasting", 7.0), 0);
  ASSERT_EQ(g.setDouble("RegistrationCoordinates.PixelSpacingLatNorth", 0.001), 0);
  ASSERT_EQ(g.setInteger("RasterInfo.NrOfLinesPerImage", 101), 0);
  ASSERT_EQ(g.setInteger("RasterInfo.NrOfPixelsPerLine", 201), 0);
  ASSERT_EQ(g.write(file("geo")), 0);  // no longitude spacing yet
  EXPECT_FALSE(g.field("DEMCoordinates.NorthingCoordinateEnd")->set);

  ASSERT_EQ(g.setDouble("RegistrationCoordinates.PixelSpacingLonEast", 0.002), 0);
  ASSERT_EQ(g.write(file("geo")), 0);
  double v = 0.0;
  EXPECT_EQ(g.getDouble("DEMCoordinates.NorthingCoordinateEnd", v), 0);
  EXPECT_NEAR(v, 45.9, 1e-12);
  EXPECT_EQ(g.getDouble("DEMCoordinates.EastingCoordinateEnd", v), 0);
  EXPECT_NEAR(v, 7.4, 1e-12);
  CSectionDataGroup r{"DEMCoordinates"};
  ASSERT_EQ(r.read(file("geo")), 0);
  EXPECT_EQ(r.getDouble("DEMCoordinates.EastingGridSize", v), 0);
  EXPECT_EQ(v, 0.002);
}

TEST_F(DescriptionTest, HostileXmlNeverCrashesTheReader) {
  std::string deep = "<HEADER_INFO>";
  for (int i = 0; i < 5000; ++i) deep += "<a>";
  struct Case {
    const char* name;
    std::string text;
    int status;
  };
  const Case cases[] = {
      {"truncated", "<?xml version=\"1.0\" ?>\n<HEADER_INFO><RasterInfo><NrOfLinesPerImage>5", 1},
      {"mismatched", "<HEADER_INFO><RasterInfo></Raster></HEADER_INFO>", 1},
      {"entity", "<HEADER_INFO><RasterInfo><CellType>&bogus;</CellType></RasterInfo></HEADER_INFO>", 1},
      {"charref", "<HEADER_INFO><R>&#x110000;</R></HEADER_INFO>", 1},
      {"deep", deep, 1},
      {"not a description", "<OmbrixXmlDoc/>", 1},
      {"binary", std::string("\0\xff\xfe<", 4), 1},
      {"empty", "", 1},
      {"two roots", "<HEADER_INFO/><HEADER_INFO/>", 1},
      {"subset", "<!DOCTYPE x [<!ENTITY a \"b\">]><HEADER_INFO/>", 1},
      // Well-formed but odd: lying counts, missing values, a matrix with ragged rows.
      {"lying counts",
       "<HEADER_INFO><ChannelInfo><PRF><VectorDouble NumberOfElements = \"2000000000\">"
       "<ValueDouble ID = \"99\">1652</ValueDouble></VectorDouble></PRF></ChannelInfo>"
       "<RasterInfo><OtherInfo><MatrixString><MatrixRow><ValueString>a</ValueString></MatrixRow>"
       "<MatrixRow/></MatrixString></OtherInfo><NrOfLinesPerImage>  12 </NrOfLinesPerImage>"
       "<DataUnits>##quotSLC##quot ##ltx##gt</DataUnits></RasterInfo></HEADER_INFO>",
       0},
  };
  for (const auto& c : cases) {
    put("h.sml", c.text);
    CSectionDataGroup g{"RasterInfo", "ChannelInfo"};
    EXPECT_EQ(g.read(file("h.sml")), c.status) << c.name;
    if (c.status == 0) {
      double v = 0.0;
      int64_t n = 0;
      std::string s;
      EXPECT_EQ(g.getDouble("ChannelInfo.PRF", v), 0);
      EXPECT_EQ(v, 1652.0);
      EXPECT_FALSE(g.field("RasterInfo.OtherInfo")->set);
      EXPECT_EQ(g.getInteger("RasterInfo.NrOfLinesPerImage", n), 0);
      EXPECT_EQ(n, 12);
      EXPECT_EQ(g.getString("RasterInfo.DataUnits", s), 0);
      EXPECT_EQ(s, "\"SLC\" <x>");
    }
  }

  // Every cut and many single-byte changes of a real description: a result, never a crash.
  CSectionDataGroup w{"RasterInfo", "ChannelInfo"};
  ASSERT_EQ(w.setValues("RasterInfo.OtherInfo", 1, 2, {std::string("a&b"), std::string("<c>")}), 0);
  ASSERT_EQ(w.setValues("ChannelInfo.PRF", 1, 2, {1.5, 2.5}), 0);
  ASSERT_EQ(w.write(file("good")), 0);
  const std::string good = slurp_text(file("good.sml"));
  for (size_t cut = 0; cut + 1 < good.size(); cut += 17) {  // the last byte is the line end
    put("m.sml", good.substr(0, cut));
    CSectionDataGroup g{"RasterInfo", "ChannelInfo"};
    EXPECT_EQ(g.read(file("m.sml")), 1) << cut;
  }
  for (size_t at = 0; at < good.size(); at += 13) {
    std::string bad = good;
    bad[at] = static_cast<char>(bad[at] ^ 0x5c);
    put("m.sml", bad);
    CSectionDataGroup g{"RasterInfo", "ChannelInfo"};
    const int st = g.read(file("m.sml"));
    EXPECT_TRUE(st == 0 || st == 1);
  }
}

}  // namespace
}  // namespace sar::io::test

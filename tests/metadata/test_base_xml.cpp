// Binding of metadata objects to header sections, in the XML and the profile dialect.
#include <gtest/gtest.h>

#include <unistd.h>

#include <cmath>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <sstream>
#include <string>

#include "metadata/base_xml.hpp"
#include "metadata/ombrixxml.hpp"

namespace fs = std::filesystem;
using sar::metadata::GeneralSAR_BaseXML;
using sar::metadata::HeaderDialect;
using sar::metadata::ombrixxml;

namespace {

// An object with every kind of binding.
struct Sample : GeneralSAR_BaseXML {
  int32_t count = 0;
  int64_t big = 0;
  float gain = 0.0f;
  double third = 0.0;
  double coeffs[3] = {0, 0, 0};
  int32_t flags[4] = {0, 0, 0, 0};
  std::string text;
  std::string names[2];
  char path[16] = {};
  int32_t optional = -7;
  int32_t looks = 1;

  int refreshParameters() override {
    createElementsVector(11);
    addElementInt("count", &count, 1, 0, 0, true);
    addElementInt64("big", &big, 1, 0, 0, true);
    addElementFloat("gain", &gain, 1, 0, 0, true);
    addElementDouble("third", &third, 1, 0, 0, true);
    addElementDouble("coeffs", coeffs, 3, 0, 0, true);
    addElementInt("flags", flags, 4, 0, 0, true);
    addElementString("text", &text, true);
    addElementString("names", names, 2, true);
    addElementString("path", std::span<char>(path), true);
    addElementInt("optional", &optional, 1, 0, 0, false);
    addElementInt("looks", &looks, 1, 1, 1000, true);
    return 0;
  }

  void fill() {
    count = -42;
    big = 5'000'000'000LL;
    gain = 3.14159274f;
    third = 1.0 / 3.0;
    coeffs[0] = 1e-300;
    coeffs[1] = -2.5e17;
    coeffs[2] = 0.1;
    for (int i = 0; i < 4; ++i) flags[i] = i * i - 3;
    text = "a, b & <c>";
    names[0] = "first";
    names[1] = "sec ond";  // a profile string array cannot hold a quote
    std::strcpy(path, "/x/y.raw");
    optional = 9;
    looks = 4;
  }
};

void expect_same(const Sample& a, const Sample& b) {
  EXPECT_EQ(a.count, b.count);
  EXPECT_EQ(a.big, b.big);
  EXPECT_EQ(a.gain, b.gain);
  EXPECT_NEAR(a.third, b.third, 1e-15 * std::fabs(b.third));
  for (int i = 0; i < 3; ++i) EXPECT_NEAR(a.coeffs[i], b.coeffs[i], 1e-14 * std::fabs(b.coeffs[i])) << i;
  for (int i = 0; i < 4; ++i) EXPECT_EQ(a.flags[i], b.flags[i]) << i;
  EXPECT_EQ(a.text, b.text);
  EXPECT_EQ(a.names[0], b.names[0]);
  EXPECT_EQ(a.names[1], b.names[1]);
  EXPECT_STREQ(a.path, b.path);
  EXPECT_EQ(a.optional, b.optional);
  EXPECT_EQ(a.looks, b.looks);
}

class BaseXmlTest : public ::testing::Test {
 protected:
  void SetUp() override {
    dir_ = fs::temp_directory_path() /
           ("sar_meta_" + std::to_string(::getpid()) + "_" +
            ::testing::UnitTest::GetInstance()->current_test_info()->name());
    fs::remove_all(dir_);
    fs::create_directories(dir_);
  }
  void TearDown() override { fs::remove_all(dir_); }
  std::string file(const std::string& name) const { return (dir_ / name).string(); }
  static void put(const std::string& path, const std::string& text) { std::ofstream(path, std::ios::binary) << text; }
  static std::string slurp(const std::string& path) {
    std::ifstream in(path, std::ios::binary);
    std::stringstream ss;
    ss << in.rdbuf();
    return ss.str();
  }
  static std::string doc(const std::string& channelBody) {
    return "<?xml version=\"1.0\"?>\n<OmbrixXmlDoc><NumberOfChannels>1</NumberOfChannels><Description/>"
           "<Channel Number=\"1\">" + channelBody + "</Channel></OmbrixXmlDoc>\n";
  }
  fs::path dir_;
};

TEST_F(BaseXmlTest, EveryTypeRoundTripsInBothDialects) {
  Sample out;
  out.fill();
  const std::string xml = file("a.hdr");
  const std::string txt = file("b.hdr");
  ASSERT_EQ(out.writeAuxiliaryFile(xml, 1, "Sample"), 0);
  ASSERT_EQ(out.writeProfileSection(txt, "Sample"), 0);
  EXPECT_EQ(sar::metadata::header_dialect(xml), HeaderDialect::kXml);
  EXPECT_EQ(sar::metadata::header_dialect(txt), HeaderDialect::kProfile);

  const std::string text = slurp(xml);
  EXPECT_NE(text.find("<Channel Number=\"1\">"), std::string::npos);
  EXPECT_NE(text.find("<val N=\"3\">"), std::string::npos);
  EXPECT_NE(text.find("<third>0.333333333333333</third>"), std::string::npos) << text;
  EXPECT_NE(text.find("<big>5000000000</big>"), std::string::npos);

  for (const std::string& path : {xml, txt}) {
    SCOPED_TRACE(path);
    Sample in;
    ASSERT_EQ(in.readSection(path, 1, "Sample"), 0);
    expect_same(in, out);
  }
  // The dialect of an existing header is kept when writing through either entry.
  out.count = 7;
  ASSERT_EQ(out.writeSection(txt, 1, "Sample"), 0);
  EXPECT_EQ(sar::metadata::header_dialect(txt), HeaderDialect::kProfile);
  Sample again;
  ASSERT_EQ(again.readSection(txt, 1, "Sample"), 0);
  EXPECT_EQ(again.count, 7);
}

TEST_F(BaseXmlTest, SectionsAndChannelsShareOneDocument) {
  const std::string path = file("multi.hdr");
  Sample a;
  a.fill();
  Sample b;
  b.fill();
  b.count = 2;
  Sample c;
  c.fill();
  c.count = 3;
  ASSERT_EQ(a.writeAuxiliaryFile(path, 1, "PolySAR/DopplerCentroid-0"), 0);
  ASSERT_EQ(b.writeAuxiliaryFile(path, 1, "Other"), 0);
  ASSERT_EQ(c.writeAuxiliaryFile(path, 2, "Other"), 0);
  a.count = 11;  // rewriting replaces the section, it does not add a second one
  ASSERT_EQ(a.writeAuxiliaryFile(path, 1, "PolySAR/DopplerCentroid-0"), 0);

  const std::string text = slurp(path);
  size_t occurrences = 0;
  for (size_t at = text.find("<DopplerCentroid-0>"); at != std::string::npos; at = text.find("<DopplerCentroid-0>", at + 1)) {
    ++occurrences;
  }
  EXPECT_EQ(occurrences, 1u);
  ombrixxml x;
  ASSERT_EQ(x.initXmlFile(path), sar::metadata::XmlOpenResult::kOk);
  int32_t channels = 0;
  ASSERT_EQ(x.readNumberOfChannels(channels), 0);
  EXPECT_EQ(channels, 2);

  const struct {
    int channel;
    const char* section;
    int32_t count;
  } cases[] = {{1, "PolySAR/DopplerCentroid-0", 11}, {1, "Other", 2}, {2, "Other", 3}};
  for (const auto& cs : cases) {
    Sample in;
    ASSERT_EQ(in.readAuxiliaryFile(path, cs.channel, cs.section), 0) << cs.section;
    EXPECT_EQ(in.count, cs.count) << cs.channel << " " << cs.section;
  }
  Sample none;
  EXPECT_EQ(none.readAuxiliaryFile(path, 3, "Other"), 1);
}

TEST_F(BaseXmlTest, CopiesWriteTheirOwnFields) {
  Sample a;
  a.fill();
  Sample b = a;
  b.count = 99;
  const std::string path = file("copy.hdr");
  ASSERT_EQ(a.writeAuxiliaryFile(path, 1, "S"), 0);  // binds a
  ASSERT_EQ(b.writeAuxiliaryFile(path, 1, "S"), 0);  // must bind b, not a
  Sample in;
  ASSERT_EQ(in.readAuxiliaryFile(path, 1, "S"), 0);
  EXPECT_EQ(in.count, 99);
}

TEST_F(BaseXmlTest, MissingAndRefusedValues) {
  Sample full;
  full.fill();
  const std::string path = file("full.hdr");
  ASSERT_EQ(full.writeAuxiliaryFile(path, 1, "S"), 0);
  const std::string text = slurp(path);

  auto without = [&](const std::string& element) {
    const size_t a = text.find("<" + element + ">");
    const size_t b = text.find("</" + element + ">");
    std::string t = text;
    t.erase(a, b + element.size() + 3 - a);
    return t;
  };
  // A required element that is absent fails the read; an optional one leaves its field alone.
  put(file("req.hdr"), without("count"));
  Sample r;
  EXPECT_EQ(r.readAuxiliaryFile(file("req.hdr"), 1, "S"), 1);
  put(file("opt.hdr"), without("optional"));
  Sample o;
  EXPECT_EQ(o.readAuxiliaryFile(file("opt.hdr"), 1, "S"), 0);
  EXPECT_EQ(o.optional, -7);
  EXPECT_EQ(o.count, -42);

  // Out of range [1, 1000] is refused and not stored.
  full.looks = 1001;
  ASSERT_EQ(full.writeAuxiliaryFile(path, 1, "S"), 0);
  Sample range;
  EXPECT_EQ(range.readAuxiliaryFile(path, 1, "S"), 1);
  EXPECT_EQ(range.looks, 1);

  // The profile dialect has the same rule.
  Sample p;
  p.fill();
  ASSERT_EQ(p.writeProfileSection(file("p.hdr"), "S"), 0);
  std::string ptext = slurp(file("p.hdr"));
  const size_t at = ptext.find("count");
  ptext.replace(at, 5, "cnt");
  put(file("p2.hdr"), ptext);
  Sample pr;
  EXPECT_EQ(pr.readProfileSection(file("p2.hdr"), "S"), 1);
}

TEST_F(BaseXmlTest, OlderCommaListsStillRead) {
  put(file("old.hdr"), doc("<S><coeffs>1.5, -2.5, 3.25, </coeffs><flags>4, 5, 6, 7, </flags>"
                           "<count> 12 </count></S>"));
  struct Old : GeneralSAR_BaseXML {
    double c[3] = {};
    int32_t f[4] = {};
    int32_t n = 0;
    int refreshParameters() override {
      addElementDouble("coeffs", c, 3, 0, 0, true);
      addElementInt("flags", f, 4, 0, 0, true);
      addElementInt("count", &n, 1, 0, 0, true);
      return 0;
    }
  } old;
  ASSERT_EQ(old.readAuxiliaryFile(file("old.hdr"), 1, "S"), 0);
  EXPECT_EQ(old.c[1], -2.5);
  EXPECT_EQ(old.c[2], 3.25);
  EXPECT_EQ(old.f[3], 7);
  EXPECT_EQ(old.n, 12);
}

TEST_F(BaseXmlTest, BadHeadersFailWithoutHarm) {
  struct One : GeneralSAR_BaseXML {
    int32_t v[2] = {5, 5};
    int refreshParameters() override { return addElementInt("v", v, 2, 0, 0, true); }
  };
  std::string random(3000, '\0');
  for (size_t i = 0; i < random.size(); ++i) random[i] = static_cast<char>((i * 2654435761u) >> 13);
  const struct {
    const char* name;
    std::string content;
  } cases[] = {
      {"empty", ""},
      {"random", random},
      {"truncated", doc("<S><v><val N=\"1\">1</val><val N=\"2\">2</val></v></S>").substr(0, 90)},
      {"other root", "<Other><NumberOfChannels>1</NumberOfChannels><Description/></Other>"},
      {"no description", "<OmbrixXmlDoc><NumberOfChannels>1</NumberOfChannels></OmbrixXmlDoc>"},
      {"index 0", doc("<S><v><val N=\"0\">1</val><val N=\"2\">2</val></v></S>")},
      {"index 99", doc("<S><v><val N=\"99\">1</val><val N=\"2\">2</val></v></S>")},
      {"index text", doc("<S><v><val N=\"one\">1</val><val N=\"2\">2</val></v></S>")},
      {"not a number", doc("<S><v><val N=\"1\">12abc</val><val N=\"2\">2</val></v></S>")},
      {"overflow", doc("<S><v><val N=\"1\">99999999999</val><val N=\"2\">2</val></v></S>")},
      {"short list", doc("<S><v>1,</v></S>")},
      {"entity", "<!DOCTYPE d [<!ENTITY e SYSTEM \"/etc/passwd\">]>" + doc("<S><v>&e;,1</v></S>")},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.name);
    const std::string path = file("bad.hdr");
    put(path, c.content);
    const std::string before = slurp(path);
    One o;
    EXPECT_EQ(o.readSection(path, 1, "S"), 1);
    EXPECT_EQ(o.v[0], 5);
    // A writer never replaces a file that it cannot read as a header document.
    if (sar::metadata::header_dialect(path) == HeaderDialect::kOtherXml || c.content.empty()) {
      EXPECT_NE(o.writeAuxiliaryFile(path, 1, "S"), 0);
      EXPECT_EQ(slurp(path), before);
    }
  }
}

TEST_F(BaseXmlTest, StrayBytesInTextsKeepTheDocumentReadable) {
  struct Texts : GeneralSAR_BaseXML {
    std::string t[3];
    int refreshParameters() override { return addElementString("t", t, 3, true); }
  } out;
  out.t[0] = std::string("nul\0ctl\x01", 8);
  out.t[1] = "latin1 \xE9";
  out.t[2] = "utf8 \xC3\xA9 \xE2\x82\xAC, tab\tend";
  const std::string path = file("texts.hdr");
  ASSERT_EQ(out.writeAuxiliaryFile(path, 1, "S"), 0);
  Texts in;
  ASSERT_EQ(in.readAuxiliaryFile(path, 1, "S"), 0);
  EXPECT_EQ(in.t[0], "nul?ctl?");
  EXPECT_EQ(in.t[1], "latin1 \xC3\xA9");
  EXPECT_EQ(in.t[2], out.t[2]);
}

TEST_F(BaseXmlTest, ReadsNeverCreateFiles) {
  Sample s;
  const std::string path = file("absent.hdr");
  EXPECT_EQ(s.readAuxiliaryFile(path, 1, "S"), 1);
  EXPECT_EQ(s.readProfileSection(path, "S"), 1);
  EXPECT_EQ(s.readSection(path, 1, "S"), 1);
  EXPECT_FALSE(fs::exists(path));
  ombrixxml x;
  EXPECT_EQ(x.initXmlFile(path), sar::metadata::XmlOpenResult::kMissing);
  EXPECT_FALSE(fs::exists(path));
}

TEST_F(BaseXmlTest, ProfileTextIsNotOverwrittenAsXml) {
  const std::string path = file("old_profile.hdr");
  put(path, "[Other]\nkey = value\n");
  Sample s;
  s.fill();
  EXPECT_EQ(s.writeAuxiliaryFile(path, 1, "S"), 1);
  EXPECT_EQ(slurp(path), "[Other]\nkey = value\n");
  // Through the dialect-keeping entry the section joins the profile file.
  ASSERT_EQ(s.writeSection(path, 1, "S"), 0);
  const std::string text = slurp(path);
  EXPECT_NE(text.find("key = value"), std::string::npos);
  EXPECT_NE(text.find("[S]"), std::string::npos);
}

}  // namespace

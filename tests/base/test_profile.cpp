#include <gtest/gtest.h>

#include <array>
#include <cstdint>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <functional>
#include <optional>
#include <sstream>
#include <string>
#include <vector>

#include "base/diagnostics.hpp"
#include "base/errors.hpp"
#include "base/profile.hpp"

namespace {

using namespace sar::base;
namespace fs = std::filesystem;

class ProfileTest : public testing::Test {
 protected:
  void SetUp() override {
    FreeProfile();
    std::string pattern = (fs::temp_directory_path() / "sar_profile_XXXXXX").string();
    ASSERT_NE(mkdtemp(pattern.data()), nullptr);
    dir_ = pattern;
  }
  void TearDown() override {
    FreeProfile();
    std::error_code ec;
    fs::remove_all(dir_, ec);
  }

  std::string path(const std::string& name) const { return (dir_ / name).string(); }

  std::string write_file(const std::string& name, const std::string& text) const {
    const std::string p = path(name);
    std::ofstream(p, std::ios::binary) << text;
    return p;
  }

  static std::string read_file(const std::string& p) {
    std::ifstream in(p, std::ios::binary);
    std::ostringstream s;
    s << in.rdbuf();
    return s.str();
  }

  static std::optional<std::string> value_of(const std::string& file, const std::string& section,
                                             const std::string& key) {
    const std::string* v = GetSetProfileChar(0, section, key, {}, file);
    return v ? std::optional<std::string>(*v) : std::nullopt;
  }

  fs::path dir_;
};

/// Counts the warnings made while it lives (reports are switched on for its lifetime).
class WarningCounter {
 public:
  WarningCounter() : saved_(ckflg_report()) {
    set_flg_report(1);
    start_ = report_count();
  }
  ~WarningCounter() { set_flg_report(saved_); }
  int count() const { return report_count() - start_; }

 private:
  int saved_;
  int start_;
};

// ----------------------------------------------------------------------------- reading

TEST_F(ProfileTest, ReaderStateMachine) {
  struct Case {
    const char* text;
    const char* section;
    const char* key;
    std::optional<std::string> value;
  };
  const Case cases[] = {
      {"[S]\nkey=value\n", "S", "key", "value"},
      {"[S]\nkey = value\n", "S", "key", "value"},
      {"[S]\n  key   =   value  \n", "S", "key", "value"},
      {"[S]\na b = 1\n", "S", "a b", "1"},
      {"[S]\nk = x=y\n", "S", "k", "x=y"},
      {"[S]\nk = v\r\n", "S", "k", "v\r"},
      {"[S]\nk\t= v\n", "S", "k\t", "v"},
      {"[S]\nk\t= v\n", "S", "k", std::nullopt},
      {"[S]\nk = last", "S", "k", "last"},
      {"[S]\nk =\n", "S", "k", ""},
      {"[ Sec ] trailing text\nk = 1\n", "Sec", "k", "1"},
      {"preamble k = 0\n[S]\nk = 1\n", "S", "k", "1"},
      {"[S]\n= comment = 5\nk = 2\n", "S", "k", "2"},
      {"[S]\nnote\nk = 1\n", "S", "note\nk", "1"},
      {"[S]\nnote\nk = 1\n", "S", "k", std::nullopt},
      {"[S]\n\nk = 1\n", "S", "\nk", "1"},
      {"[A]\nab[B]\nk = 1\n", "B", "k", "1"},
      {"[S]\nK = 1\n", "S", "k", std::nullopt},
      {"[S]\nk = [not a section]\n", "S", "k", "[not a section]"},
      {"[S]\nk = {1 2}\n\t{3 4}\nn = 2\n", "S", "k", "{1 2}\n\t{3 4}"},
      {"[S]\nk = {1 2}\n\t{3 4}\nn = 2\n", "S", "n", "2"},
      {"[S]\nk = 1\n{3 4} = 2\n", "S", "{3 4}", "2"},
  };
  int i = 0;
  for (const auto& c : cases) {
    const std::string file = write_file("case" + std::to_string(i++) + ".hdr", c.text);
    EXPECT_EQ(value_of(file, c.section, c.key), c.value) << c.text;
  }
}

TEST_F(ProfileTest, DuplicateSectionsAndKeysLastWins) {
  const std::string text = "[S]\nk = 1\nonly = a\n[T]\nx = 0\n[S]\nk = 2\nk = 3\n";
  const std::string file = write_file("dup.hdr", text);
  EXPECT_EQ(value_of(file, "S", "k"), "3");
  // The lookup stops at the later section: a key of the earlier one is not found.
  EXPECT_EQ(value_of(file, "S", "only"), std::nullopt);

  // A write goes to the node that the lookup finds; all nodes are written back in file order.
  ASSERT_EQ(WriteMyProfileString("S", "k", "4", file), kProfileOk);
  ASSERT_EQ(SyncProfile(file), 0);
  EXPECT_EQ(read_file(file), "[S]\nk = 1\nonly = a\n\n[T]\nx = 0\n\n[S]\nk = 2\nk = 4\n");
}

TEST_F(ProfileTest, CacheLifecycle) {
  // An absent file is an empty profile; a write creates it at the next sync.
  const std::string created = path("new.hdr");
  EXPECT_EQ(value_of(created, "S", "k"), std::nullopt);
  ASSERT_EQ(WriteMyProfileInt("S", "k", 7, created), kProfileOk);
  EXPECT_FALSE(fs::exists(created));
  ASSERT_EQ(SyncProfile(created), 0);
  EXPECT_EQ(read_file(created), "[S]\nk = 7\n");

  // Changes on disk stay unseen until the file is dropped from the cache.
  const std::string file = write_file("c.hdr", "[S]\nk = abcdef\n");
  EXPECT_EQ(value_of(file, "S", "k"), "abcdef");
  write_file("c.hdr", "[S]\nk = 2\n");
  std::string v;
  ASSERT_EQ(GetMyProfileString("S", "k", v, 4, file), kProfileOk);
  EXPECT_EQ(v, "abc");
  FreeProfile(file);
  ASSERT_EQ(GetParString(file, "k", 1, v, 1, "S"), kProfileOk);
  EXPECT_EQ(v, "2");
}

TEST_F(ProfileTest, NumberArrays) {
  const std::string file = write_file("n.hdr",
                                      "[S]\nlist = {1 2 3}\nplain = 12\ncomma = {1,2}\ntabs = {4\t5  6}\n"
                                      "big = {9007199254740993 -5}\nreal = {1.5 -2e3 0.1}\nshort = {1 2}\n"
                                      "junk = {1 x 3}\n");
  WarningCounter warnings;

  std::array<int32_t, 3> ints{};
  EXPECT_EQ(GetMyProfileIntArray("S", "list", ints, file), kProfileOk);
  EXPECT_EQ(ints, (std::array<int32_t, 3>{1, 2, 3}));
  EXPECT_EQ(GetMyProfileIntArray("S", "tabs", ints, file), kProfileOk);
  EXPECT_EQ(ints, (std::array<int32_t, 3>{4, 5, 6}));

  int32_t one = 0;
  EXPECT_EQ(GetMyProfileIntArray("S", "plain", std::span(&one, 1), file), kProfileOk);
  EXPECT_EQ(one, 12);
  // Extra values are ignored.
  EXPECT_EQ(GetMyProfileIntArray("S", "list", std::span(&one, 1), file), kProfileOk);
  EXPECT_EQ(one, 1);
  EXPECT_EQ(warnings.count(), 0);

  // "1,2" converts as far as it can: one element, then the list ends.
  std::array<int32_t, 2> two{};
  EXPECT_EQ(GetMyProfileIntArray("S", "comma", two, file), kProfileFailed);
  EXPECT_EQ(two[0], 1);
  EXPECT_EQ(GetMyProfileIntArray("S", "comma", std::span(&one, 1), file), kProfileOk);
  EXPECT_EQ(GetMyProfileIntArray("S", "junk", ints, file), kProfileFailed);
  EXPECT_EQ(GetMyProfileIntArray("S", "short", ints, file), kProfileFailed);
  EXPECT_EQ(warnings.count(), 3);
  // A missing key fails without a report.
  EXPECT_EQ(GetMyProfileIntArray("S", "absent", ints, file), kProfileFailed);
  EXPECT_EQ(warnings.count(), 3);

  std::array<int64_t, 2> big{};
  EXPECT_EQ(GetMyProfileInt64Array("S", "big", big, file), kProfileOk);
  EXPECT_EQ(big[0], 9007199254740993LL);
  EXPECT_EQ(big[1], -5);
  std::array<long, 2> longs{};
  EXPECT_EQ(GetParInt(file, "big", std::span(&one, 1), "S"), kProfileFailed);  // out of range for int32
  EXPECT_EQ(GetMyProfileLongArray("S", "big", longs, file), kProfileOk);
  EXPECT_EQ(longs[1], -5L);

  std::array<double, 3> doubles{};
  EXPECT_EQ(GetProfileDoubleArray("S", "real", doubles, file), kProfileOk);
  EXPECT_EQ(doubles, (std::array<double, 3>{1.5, -2000.0, 0.1}));
  std::array<float, 3> floats{};
  EXPECT_EQ(GetMyProfileFloatArray("S", "real", floats, file), kProfileOk);
  EXPECT_EQ(GetParFloat(file, "real", floats, "S"), kProfileOk);
  EXPECT_EQ(floats[2], 0.1f);
}

TEST_F(ProfileTest, StringArrays) {
  const std::string file = write_file("a.hdr",
                                      "[S]\nabc = {\"a\" \"b c\"  \"d\"}\nplain = text\nbad = {\"a\" x}\n"
                                      "open = {\"a\" \"b\nlong = {\"abcdef\"}\n");
  WarningCounter warnings;
  std::vector<std::string> v;
  EXPECT_EQ(GetMyProfileStringArray("S", "abc", v, 3, file, 64), kProfileOk);
  EXPECT_EQ(v, (std::vector<std::string>{"a", "b c", "d"}));
  EXPECT_EQ(GetMyProfileStringArray("S", "abc", v, 4, file, 64), kProfileFailed);
  EXPECT_EQ(warnings.count(), 1);

  std::vector<std::string> untouched{"x"};
  EXPECT_EQ(GetMyProfileStringArray("S", "plain", untouched, 1, file, 64), kProfileOk);
  EXPECT_EQ(untouched[0], "x");

  EXPECT_EQ(GetMyProfileStringArray("S", "bad", v, 1, file, 64), kProfileOk);  // count reached first
  EXPECT_EQ(GetMyProfileStringArray("S", "bad", v, 2, file, 64), kProfileFailed);
  EXPECT_EQ(GetMyProfileStringArray("S", "open", v, 2, file, 64), kProfileFailed);
  EXPECT_EQ(GetMyProfileStringArray("S", "long", v, 1, file, 4), kProfileOk);
  EXPECT_EQ(v[0], "abc");
}

// ----------------------------------------------------------------------------- writing

TEST_F(ProfileTest, WriteFormats) {
  const std::string file = path("w.hdr");
  const std::array<int32_t, 3> ints{1, -2, 3};
  const std::array<int64_t, 2> int64s{9007199254740993LL, -1};
  const std::array<long, 1> longs{-7};
  const std::array<float, 3> floats{1.5f, 0.1f, 1.0f / 3.0f};
  const std::array<double, 2> doubles{0.1, 1.0 / 3.0};
  const std::array<std::string, 2> strings{"a", "b c"};

  ASSERT_EQ(WriteMyProfileInt("S", "int", -42, file), kProfileOk);
  ASSERT_EQ(WriteMyProfileInt64("S", "int64", 9007199254740993LL, file), kProfileOk);
  ASSERT_EQ(WriteMyProfileDouble("S", "double", 2.0 / 3.0, file), kProfileOk);
  ASSERT_EQ(WriteMyProfileDouble("S", "round", 1e21, file), kProfileOk);
  ASSERT_EQ(WriteMyProfileIntArray("S", "ints", ints, file), kProfileOk);
  ASSERT_EQ(WriteMyProfileInt64Array("S", "int64s", int64s, file), kProfileOk);
  ASSERT_EQ(WriteMyProfileLongArray("S", "longs", longs, file), kProfileOk);
  ASSERT_EQ(WriteMyProfileFloatArray("S", "floats", floats, file), kProfileOk);
  ASSERT_EQ(WriteProfileDoubleArray("S", "doubles", doubles, file), kProfileOk);
  ASSERT_EQ(WriteMyProfileIntArray("S", "empty", std::span<const int32_t>(), file), kProfileOk);
  ASSERT_EQ(WriteMyProfileStringArray("S", "strings", strings, file), kProfileOk);
  ASSERT_EQ(WriteMyProfileStringQuote("S", "quoted", "x y", file), kProfileOk);
  ASSERT_EQ(WriteMyProfileString("S", "plain", "as is ", file), kProfileOk);
  ASSERT_EQ(SyncProfile(file), 0);
  EXPECT_EQ(read_file(file),
            "[S]\nint = -42\nint64 = 9007199254740993\ndouble = 0.666666666666667\nround = 1e+21\n"
            "ints = {1 -2 3}\nint64s = {9007199254740993 -1}\nlongs = {-7}\nfloats = {1.5 0.1 0.3333333}\n"
            "doubles = {0.1 0.333333333333333}\nempty = {}\nstrings = {\"a\" \"b c\"}\nquoted = \"x y\"\n"
            "plain = as is \n");
}

TEST_F(ProfileTest, WriteSyncReadBackKeepsOrder) {
  const std::string file = write_file("o.hdr", "[A]\nx = 1\n[B]\ny = 3\n");
  ASSERT_EQ(WriteMyProfileInt("C", "z", 4, file), kProfileOk);
  ASSERT_EQ(WriteMyProfileInt("A", "new", 2, file), kProfileOk);
  ASSERT_EQ(WriteMyProfileInt("B", "y", 5, file), kProfileOk);
  ASSERT_EQ(SyncProfile(file), 0);
  const std::string expected = "[A]\nx = 1\nnew = 2\n\n[B]\ny = 5\n\n[C]\nz = 4\n";
  EXPECT_EQ(read_file(file), expected);

  // A written file reads back to the same tree.
  FreeProfile();
  EXPECT_EQ(value_of(file, "A", "new"), "2");
  EXPECT_EQ(value_of(file, "C", "z"), "4");
  ASSERT_EQ(SyncProfile(file), 0);
  EXPECT_EQ(read_file(file), expected);
}

TEST_F(ProfileTest, SyncResultsAndSetParSyncsAtOnce) {
  const std::string good = path("g.hdr");
  const std::string unwritable = path("missing_dir/u.hdr");
  EXPECT_EQ(SyncProfile(good), 0);  // not in the cache
  const std::array<double, 2> d{1.25, -3};
  ASSERT_EQ(SetParDouble(good, "d", d, "P"), kProfileOk);
  ASSERT_EQ(SetParString(good, "s", "text", "P"), kProfileOk);
  EXPECT_EQ(read_file(good), "[P]\nd = {1.25 -3}\ns = text\n");
  EXPECT_EQ(SetParString(unwritable, "s", "text", "P"), kProfileFailed);
  EXPECT_EQ(SyncProfile(unwritable), 1);
  EXPECT_EQ(SyncProfile(), -1);
  std::array<int32_t, 1> i{};
  EXPECT_EQ(GetParInt(good, "d", i, "P"), kProfileOk);  // "1.25" converts as far as it can
  EXPECT_EQ(i[0], 1);
}

TEST_F(ProfileTest, DeleteKeysAndSections) {
  const std::string file = write_file("d.hdr", "[A]\nx = 1\ny = 2\n[B]\nz = 3\n");
  testing::internal::CaptureStderr();
  DelProfileKey("A", "x", path("other.hdr"));
  DelProfileSection("A", path("other.hdr"));
  EXPECT_EQ(testing::internal::GetCapturedStderr(),
            "Warning: DelProfileKey called before init\nWarning: DelProfileSection called before init\n");

  ASSERT_EQ(value_of(file, "A", "x"), "1");
  DelProfileKey("A", "x", file);
  DelProfileSection("B", file);
  ASSERT_EQ(SyncProfile(file), 0);
  EXPECT_EQ(read_file(file), "[A]\ny = 2\n");
}

// ----------------------------------------------------------------------------- matrices

TEST_F(ProfileTest, MatricesRoundTripBeforeAPlainKey) {
  const std::string file = path("m.hdr");
  const std::array<double, 6> pos{7000000.5, -1.25, 3e-7, 4, 5, 6};
  const std::array<double, 6> vel{-7500.125, 0.1, 2, 3, 4, 1.0 / 3.0};
  const std::array<std::string, 4> names{"a", "b c", "d", "e"};
  ASSERT_EQ(WriteMyProfileDoubleMatrix("StateVectorData", "pos", pos, 2, 3, file), kProfileOk);
  ASSERT_EQ(WriteMyProfileDoubleMatrix("StateVectorData", "vel", vel, 2, 3, file), kProfileOk);
  ASSERT_EQ(WriteMyProfileStringMatrix("StateVectorData", "names", names, 2, 2, file), kProfileOk);
  ASSERT_EQ(WriteMyProfileInt("StateVectorData", "n", 2, file), kProfileOk);
  ASSERT_EQ(SyncProfile(file), 0);
  const std::string written = read_file(file);
  EXPECT_EQ(written,
            "[StateVectorData]\npos = {7000000.5 -1.25 3e-07}\n\t{4 5 6}\n"
            "vel = {-7500.125 0.1 2}\n\t{3 4 0.333333333333333}\n"
            "names = {\"a\" \"b c\"}\n\t{\"d\" \"e\"}\nn = 2\n");
  FreeProfile();

  std::array<double, 6> p{}, v{};
  ASSERT_EQ(GetMyProfileDoubleMatrix("StateVectorData", "pos", p, 2, 3, file), kProfileOk);
  ASSERT_EQ(GetMyProfileDoubleMatrix("StateVectorData", "vel", v, 2, 3, file), kProfileOk);
  EXPECT_EQ(p, pos);
  for (std::size_t i = 0; i < v.size(); ++i) EXPECT_NEAR(v[i], vel[i], 1e-14) << i;
  std::vector<std::string> s;
  ASSERT_EQ(GetMyProfileStringMatrix("StateVectorData", "names", s, 2, 2, file, 64), kProfileOk);
  EXPECT_EQ(s, (std::vector<std::string>{"a", "b c", "d", "e"}));
  EXPECT_EQ(GetCheckMyProfileInt("StateVectorData", "n", file), 2);
  EXPECT_EQ(value_of(file, "StateVectorData", "vel"), "{-7500.125 0.1 2}\n\t{3 4 0.333333333333333}");

  // The first row alone is a number array; asking for more rows than stand fails.
  std::array<double, 3> row{};
  EXPECT_EQ(GetProfileDoubleArray("StateVectorData", "pos", row, file), kProfileOk);
  EXPECT_EQ(row[0], 7000000.5);
  std::array<double, 9> three{};
  {
    WarningCounter warnings;
    EXPECT_EQ(GetMyProfileDoubleMatrix("StateVectorData", "pos", three, 3, 3, file), kProfileFailed);
    EXPECT_EQ(warnings.count(), 1);
  }
  EXPECT_EQ(GetMyProfileDoubleMatrix("StateVectorData", "pos", row, 2, 3, file), kProfileFailed);

  // Read and written back without change.
  ASSERT_EQ(SyncProfile(file), 0);
  EXPECT_EQ(read_file(file), written);

  WarningCounter warnings;
  EXPECT_EQ(WriteMyProfileDoubleMatrix("S", "m", row, 2, 2, file), kProfileFailed);  // 3 values for 2 x 2
  EXPECT_EQ(warnings.count(), 1);
  EXPECT_EQ(value_of(file, "S", "m"), std::nullopt);
}

// ----------------------------------------------------------------------------- checked forms

TEST_F(ProfileTest, CheckedReadsEndTheRunWithTheirLine) {
  const std::string file = write_file("chk.hdr", "[S]\nk = {1 2}\nstr = {\"a\"}\n");
  std::array<int32_t, 3> i3{};
  std::array<int64_t, 3> l3{};
  std::array<long, 3> g3{};
  std::array<float, 3> f3{};
  std::array<double, 3> d3{};
  std::vector<std::string> s;
  std::string v;
  const std::string tail = ", file " + file + "\n";
  const std::pair<std::function<void()>, std::string> cases[] = {
      {[&] { GetCheckMyProfileString("S", "none", v, 8, file); },
       "Error in GetMyProfileString: section S, key none" + tail},
      {[&] { GetCheckMyProfileStringArray("S", "str", s, 2, file, 8); },
       "Error in GetMyProfileStringArray: section S, key str" + tail},
      {[&] { GetCheckMyProfileIntArray("S", "k", i3, file); }, "Error in GetMyProfileIntArray: section S, key k" + tail},
      {[&] { GetCheckMyProfileInt64Array("S", "k", l3, file); },
       "Error in GetMyProfileInt64Array: section S, key k" + tail},
      {[&] { GetCheckMyProfileLongArray("S", "k", g3, file); },
       "Error in GetMyProfileLongArray: section S, key k" + tail},
      {[&] { GetCheckMyProfileFloatArray("S", "k", f3, file); },
       "Error in GetMyProfileFloatArray: section S, key k" + tail},
      {[&] { GetCheckMyProfileDoubleArray("T", "k", d3, file); },
       "Error in WriteMyProfileDouble: section T, key k" + tail},
      {[&] { GetCheckMyProfileInt("S", "none", file); }, "Error in GetMyProfileIntArray: section S, key none" + tail},
      {[&] { GetCheckMyProfileDouble("S", "none", file); },
       "Error in WriteMyProfileDouble: section S, key none" + tail},
  };
  for (const auto& [call, line] : cases) {
    testing::internal::CaptureStderr();
    int status = -1;
    try {
      call();
    } catch (const ProcessExit& e) {
      status = e.status;
    }
    EXPECT_EQ(testing::internal::GetCapturedStderr(), line);
    EXPECT_EQ(status, 1) << line;
  }

  // The same forms pass quietly when the value is there.
  std::array<int32_t, 2> i2{};
  EXPECT_NO_THROW(GetCheckMyProfileIntArray("S", "k", i2, file));
  EXPECT_NO_THROW(WriteCheckMyProfileDouble("S", "d", 1.5, file));
  EXPECT_EQ(GetCheckMyProfileDouble("S", "d", file), 1.5);
}

}  // namespace

#include <gtest/gtest.h>

#include <array>
#include <vector>
#include <bit>
#include <chrono>
#include <cmath>
#include <cstdio>
#include <cstring>
#include <limits>
#include <random>
#include <string>

#include "base/convert.hpp"
#include "base/errors.hpp"

namespace {

using namespace sar::base;
namespace chr = std::chrono;

/// Runs `f`, which must end the run with status 1, and returns what it printed on stderr.
template <class F>
std::string exit1_stderr(F&& f) {
  testing::internal::CaptureStderr();
  bool exited = false;
  try {
    f();
  } catch (const ProcessExit& e) {
    exited = true;
    EXPECT_EQ(e.status, 1);
  }
  std::string err = testing::internal::GetCapturedStderr();
  EXPECT_TRUE(exited) << "no ProcessExit";
  return err;
}

constexpr const char* kMonths[] = {"JAN", "FEB", "MAR", "APR", "MAY", "JUN",
                                   "JUL", "AUG", "SEP", "OCT", "NOV", "DEC"};

/// Time text of whole seconds since 1-JAN-1985 through the standard calendar (an oracle
/// independent of the code under test).
std::string oracle_text(int64_t whole, unsigned micro) {
  const chr::sys_days epoch = chr::year{1985} / chr::January / 1;
  const int64_t dayCount = whole >= 0 ? whole / 86400 : -((-whole + 86399) / 86400);
  const int64_t inDay = whole - dayCount * 86400;
  const chr::year_month_day ymd{epoch + chr::days{dayCount}};
  char text[64];
  std::snprintf(text, sizeof text, "%02u-%s-%04d %02d:%02d:%02d.%06u", static_cast<unsigned>(ymd.day()),
                kMonths[static_cast<unsigned>(ymd.month()) - 1], static_cast<int>(ymd.year()),
                static_cast<int>(inDay / 3600), static_cast<int>(inDay / 60 % 60), static_cast<int>(inDay % 60), micro);
  return text;
}

// ----------------------------------------------------------------------------- byte order

TEST(ConvertByteOrder, ReadsAndWritesBothOrders) {
  const unsigned char b[8] = {0x12, 0x34, 0x56, 0x78, 0x9A, 0xBC, 0xDE, 0xF0};
  EXPECT_EQ(ch2uint2(b, 'l'), 0x3412u);
  EXPECT_EQ(ch2uint2(b, 'm'), 0x1234u);
  EXPECT_EQ(ch2uint4(b, 'l'), 0x78563412u);
  EXPECT_EQ(ch2int4(b + 4, 'm'), static_cast<int32_t>(0x9ABCDEF0u));
  EXPECT_EQ(ch2long4(b + 4, 'l'), static_cast<int32_t>(0xF0DEBC9Au));
  const unsigned char neg[8] = {0xFF, 0xFE, 0, 0, 0x3F, 0x80, 0, 0};
  EXPECT_EQ(ch2int2(neg, 'm'), -2);
  EXPECT_EQ(ch2float4(neg + 4, 'm'), 1.0f);
  const unsigned char minusTwoD[8] = {0xC0, 0x00, 0, 0, 0, 0, 0, 0};
  EXPECT_EQ(ch2double8(minusTwoD, 'm'), -2.0);

  for (char order : {'l', 'm'}) {
    unsigned char buf[4] = {};
    float2ch(-1234.5f, buf, order);
    EXPECT_EQ(ch2float4(buf, order), -1234.5f);
    short2ch(-300, buf, order);
    EXPECT_EQ(ch2int2(buf, order), -300);
    long2ch(0x01020304, buf, order);
    EXPECT_EQ(buf[0], order == 'm' ? 0x01 : 0x04);
    EXPECT_EQ(ch2long4(buf, order), 0x01020304);
  }
  EXPECT_EQ(my_endian(), 0);
  EXPECT_EQ(endi(), 'l');
}

TEST(ConvertByteOrder, WrongSelectorEndsTheRun) {
  const unsigned char b[8] = {0x12, 0x34};
  unsigned char out[4] = {};
  EXPECT_EQ(exit1_stderr([&] { ch2uint2(b, 'b'); }), "\norder must be 'm' or 'l'!\n");
  EXPECT_EQ(exit1_stderr([&] { ch2double8(b, 'L'); }), "\norder must be 'm' or 'l'!\n");
  EXPECT_EQ(exit1_stderr([&] { long2ch(1, out, 'x'); }), "\norder must be 'm' or 'l'!\n");
}

TEST(ConvertSwap, ReversesElementsAndGetEndianBySize) {
  std::array<unsigned char, 32> buf{};
  for (std::size_t i = 0; i < buf.size(); ++i) buf[i] = static_cast<unsigned char>(i);
  auto b = buf;
  swp2(b.data(), 1);
  swp4(b.data() + 4, 1);
  swp8(b.data() + 8, 1);
  EXPECT_EQ((std::vector<int>(b.begin(), b.begin() + 17)),
            (std::vector<int>{1, 0, 2, 3, 7, 6, 5, 4, 15, 14, 13, 12, 11, 10, 9, 8, 16}));
  b = buf;
  swp_any(b.data(), 16, 3);  // odd sizes do nothing
  EXPECT_EQ(b, buf);
  EXPECT_EQ(bsw2b(0xAABB1234u), 0xAABB3412u);

  struct Case {
    std::size_t count, size;
    int fileOrder, status;
    int byte0, byte16;  // bytes 0 and 16 afterwards
  };
  const Case cases[] = {
      {8, 4, 0, 0, 0, 16},   // already in machine order
      {32, 1, 1, 0, 0, 16},  // bytes need no swap
      {8, 4, 1, 0, 3, 19},   {2, 8, 1, 0, 7, 16},
      {2, 16, 1, 0, 0, 16},  // size 16 takes `count` as bytes: 2 is no whole element
      {16, 16, 1, 0, 15, 16},
      {4, 3, 1, -1, 0, 16},
  };
  for (const auto& c : cases) {
    b = buf;
    EXPECT_EQ(get_endian(b.data(), c.count, c.size, c.fileOrder), c.status) << c.size;
    EXPECT_EQ(b[0], c.byte0) << c.size << " " << c.count;
    EXPECT_EQ(b[16], c.byte16) << c.size << " " << c.count;
  }
}

TEST(ConvertFloatTests, ClassifyByBitPattern) {
  const struct {
    uint64_t bits;
    bool inf, nan;
  } doubles[] = {{0x7FF0000000000000ull, true, false}, {0xFFF0000000000000ull, true, false},
                 {0x7FF8000000000000ull, false, true}, {0x7FF0000000000001ull, false, true},
                 {0xFFFFFFFFFFFFFFFFull, false, true}, {0x7FEFFFFFFFFFFFFFull, false, false},
                 {0x0000000000000001ull, false, false}, {0x8000000000000000ull, false, false}};
  for (const auto& c : doubles) {
    const double v = std::bit_cast<double>(c.bits);
    EXPECT_EQ(myisinf(v), c.inf) << std::hex << c.bits;
    EXPECT_EQ(myisnan(v), c.nan) << std::hex << c.bits;
    EXPECT_EQ(myfinite(v), !c.inf && !c.nan) << std::hex << c.bits;
  }
  const struct {
    uint32_t bits;
    bool inf, nan;
  } floats[] = {{0x7F800000u, true, false}, {0xFF800000u, true, false}, {0x7F800001u, false, true},
                {0xFFC00000u, false, true}, {0x7F7FFFFFu, false, false}, {0x00000001u, false, false}};
  for (const auto& c : floats) {
    const float v = std::bit_cast<float>(c.bits);
    EXPECT_EQ(myisinf4(v), c.inf) << std::hex << c.bits;
    EXPECT_EQ(myisnan4(v), c.nan) << std::hex << c.bits;
    EXPECT_EQ(myfinite4(v), !c.inf && !c.nan) << std::hex << c.bits;
  }
  const char* s = "Jan";
  EXPECT_EQ(mystrcasecmp(s, s), 0);
  EXPECT_EQ(mystrcasecmp("feb", "FEB"), 0);
  EXPECT_LT(mystrcasecmp("abc", "ABD"), 0);
  EXPECT_GT(mystrcasecmp("abcd", "ABC"), 0);
}

// ----------------------------------------------------------------------------- dates

TEST(ConvertDate, ParseResultsAndErrorBits) {
  struct Case {
    const char* text;
    int status;
    int yday;
  };
  const Case cases[] = {
      {"29-FEB-2000", 0, 60},
      {"29-FEB-1900", 0x1, 0},
      {"29-FEB-2004 10:00:00", 0, 60},
      {"31-DEC-2004", 0, 366},
      {"31-DEC-2003", 0, 365},
      {"01-mar-2001", 0, 60},
      {"00-JAN-2004", 0, 0},
      {"32-JAN-2003 10:00:00", 0x1, 0},
      {"10-XYZ-2003 10:00:00", 0x1000, 0},
      {"01-JAN-2004 25:00:00", 0x10, 0},
      {"01-JAN-2004 24:60:60.0", 0, 1},
      {"01-JAN-2004 10:61:00", 0x1000, 0},
      {"01-JAN-2004 10:00:61", 0x10000, 0},
      {"01-JAN-2004 -1:-1:-1", 0x10 | 0x1000 | 0x10000, 0},
      {"", -1, 0},
      {"no digit here", -1, 0},
      {"........................................1-JAN-1985", -1, 0},
  };
  for (const auto& c : cases) {
    DateParts d;
    EXPECT_EQ(date2str(c.text, d), c.status) << c.text;
    if (c.status == 0) {
      EXPECT_EQ(d.yday, c.yday) << c.text;
    }
  }

  DateParts d;
  ASSERT_EQ(date2str("  01-JAN-2004 01:02:03.5", d), 0);
  EXPECT_EQ(d.year, 2004);
  EXPECT_EQ(d.month, 1);
  EXPECT_EQ(d.hours, 1);
  EXPECT_EQ(d.minutes, 2);
  EXPECT_EQ(d.seconds, 3);
  EXPECT_DOUBLE_EQ(d.fraction, 0.5);
}

TEST(ConvertDate, Sec85OfKnownDates) {
  struct Case {
    const char* text;
    double sec85;
  };
  const Case cases[] = {
      {"1-JAN-1985 00:00:00.000000", 0.0},
      {"01-JAN-1985 00:00:01.250000", 1.25},
      {"02-JAN-1985", 86400.0},
      {"01-JAN-2000 00:00:00.000000", kSec85AtMjd2000},
      {"01-MAR-1988", (365.0 * 3 + 31 + 29) * 86400.0},
      {"31-DEC-1984 23:59:59", -1.0},
      {"01-JAN-1984", -366 * 86400.0},
      {"01-JAN-1900", -(85 * 365.0 + 21) * 86400.0},
  };
  for (const auto& c : cases) EXPECT_EQ(ascii2sec85(c.text), c.sec85) << c.text;
}

TEST(ConvertDate, BadTextPrintsCodeAndGivesZero) {
  testing::internal::CaptureStderr();
  EXPECT_EQ(ascii2sec85("32-JAN-2003 10:00:00"), 0.0);
  EXPECT_EQ(testing::internal::GetCapturedStderr(), "Error: incorrect date format, code 1\n");
}

TEST(ConvertDate, Sec85Texts) {
  struct Case {
    double sec85;
    const char* text;
  };
  const Case cases[] = {
      {0.0, "01-JAN-1985 00:00:00.000000"},
      {1999999.999999999, "24-JAN-1985 03:33:19.999999"},
      {86399.9999999, "01-JAN-1985 23:59:59.999999"},
      {kSec85AtMjd2000 + 59 * 86400.0 + 0.5, "29-FEB-2000 00:00:00.500000"},
      {kSec85AtMjd2000 + 366 * 86400.0, "01-JAN-2001 00:00:00.000000"},
  };
  for (const auto& c : cases) {
    std::string text;
    ASSERT_EQ(sec852myascii(c.sec85, text), 0);
    EXPECT_EQ(text, c.text);
  }

  char raw[28];
  std::memset(raw, 'X', sizeof raw);
  ASSERT_EQ(sec852ascii(86400.0, raw), 0);
  EXPECT_EQ(std::string(raw, 27), "02-JAN-1985 00:00:00.000000");
  EXPECT_EQ(raw[27], 'X');
}

TEST(ConvertDate, NegativeSec85IsRefusedAndLeavesBuffer) {
  for (double bad : {-0.5, -1e9, std::numeric_limits<double>::quiet_NaN()}) {
    std::string text = "keep";
    testing::internal::CaptureStderr();
    EXPECT_EQ(sec852myascii(bad, text), -1);
    EXPECT_EQ(testing::internal::GetCapturedStderr(), "Date should be later than 1-JAN-1985\n");
    EXPECT_EQ(text, "keep");
  }
}

TEST(ConvertDate, RandomTimesRoundTripAtMicroseconds) {
  std::mt19937_64 rng(20240229);
  // Up to the end of 2099: well inside the range where a double still resolves microseconds.
  std::uniform_int_distribution<int64_t> wholeDist(0, 3629318399);
  std::uniform_int_distribution<unsigned> microDist(0, 999999);
  for (int i = 0; i < 20000; ++i) {
    const int64_t whole = i < 4 ? i * 86399 : wholeDist(rng);
    const unsigned micro = i % 7 == 0 ? 999999u : microDist(rng);
    const std::string text = oracle_text(whole, micro);
    const double sec85 = ascii2sec85(text);
    ASSERT_NEAR(sec85, static_cast<double>(whole) + micro * 1e-6, 5e-7) << text;
    std::string back;
    ASSERT_EQ(sec852myascii(sec85, back), 0);
    ASSERT_EQ(back, text);
  }
  // Before the epoch the text still converts, to a negative sec85 (back to 1896).
  std::uniform_int_distribution<int64_t> beforeDist(-2800000000, -1);
  for (int i = 0; i < 2000; ++i) {
    const int64_t whole = beforeDist(rng);
    ASSERT_EQ(ascii2sec85(oracle_text(whole, 0)), static_cast<double>(whole)) << oracle_text(whole, 0);
  }
}

TEST(ConvertMjd, KnownValuesAndRoundTrip) {
  unsigned char zero[12] = {};
  EXPECT_EQ(mjd2sec85(zero), 473299200.0);

  unsigned char buf[12];
  long2ch(-1, buf, 'm');
  long2ch(86399, buf + 4, 'm');
  long2ch(500000, buf + 8, 'm');
  EXPECT_EQ(mjd2sec85(buf), kSec85AtMjd2000 - 0.5);
  char text[27];
  mjd2ascii(buf, text);
  EXPECT_EQ(std::string(text, 27), "31-DEC-1999 23:59:59.500000");

  std::mt19937 rng(2000);
  std::uniform_int_distribution<int32_t> dayDist(-5000, 36500), secDist(0, 86399), usDist(0, 999999);
  for (int i = 0; i < 20000; ++i) {
    const int32_t d = dayDist(rng), s = secDist(rng), u = i % 5 == 0 ? 999999 : usDist(rng);
    unsigned char in[12], out[12];
    long2ch(d, in, 'm');
    long2ch(s, in + 4, 'm');
    long2ch(u, in + 8, 'm');
    sec852mjd(mjd2sec85(in), out);
    ASSERT_EQ(ch2long4(out, 'm'), d);
    ASSERT_EQ(ch2long4(out + 4, 'm'), s);
    ASSERT_EQ(ch2long4(out + 8, 'm'), u) << d << " " << s;

    mjd2ascii(in, text);
    ASSERT_EQ(std::string(text, 27), oracle_text(473299200 + int64_t{d} * 86400 + s, static_cast<unsigned>(u)));
  }
}

TEST(ConvertDate, UtcAsDecimalNumber) {
  EXPECT_DOUBLE_EQ(utc_ch2num("01-FEB-2004 12:34:56.789"), 20040201.0 * 1e6 + 123456 + 0.789);
  EXPECT_DOUBLE_EQ(utc_ch2num("31-DEC-1999 23:59:59.000"), 19991231.0 * 1e6 + 235959);
  // The month is matched case-sensitively; anything else is month 13.
  EXPECT_DOUBLE_EQ(utc_ch2num("01-Feb-2004 00:00:00.000"), 20041301.0 * 1e6);
}

// ----------------------------------------------------------------------------- fixed fields

TEST(ConvertFields, FixedFieldNumbers) {
  struct Case {
    const char* text;
    int length;
    double value;
  };
  const Case cases[] = {
      {"  -12.50", 8, -12.5}, {"   3.25 ", 8, 3.25},      {"1.2 5", 5, 1.25},
      {"12.345678", 5, 12.34}, {"    .5", 6, 0.5},         {"  1234.", 7, 1234.0},
  };
  for (const auto& c : cases) EXPECT_DOUBLE_EQ(FtoDouble(c.text, c.length), c.value) << c.text;

  EXPECT_DOUBLE_EQ(FtoDouble2("  -1.5E+03"), -1500.0);
  EXPECT_DOUBLE_EQ(FtoDouble2("2.500000000000000E-02"), 0.025);
  EXPECT_DOUBLE_EQ(FtoDouble2(" +7"), 7.0);
  EXPECT_DOUBLE_EQ(FtoDouble2("1.0D2"), 100.0);

  EXPECT_EQ(ch2int("  123", 5), 123);
  EXPECT_EQ(ch2int("12345", 3), 123);
  EXPECT_EQ(ch2int(" -42 ", 5), -42);
}

}  // namespace

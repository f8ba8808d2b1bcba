#include "base/convert.hpp"

#include <algorithm>
#include <array>
#include <bit>
#include <cctype>
#include <charconv>
#include <cmath>
#include <cstdio>
#include <cstring>
#include <limits>
#include <system_error>

#include "base/errors.hpp"

namespace sar::base {

namespace {

// ----------------------------------------------------------------------------- byte order

/// True for big-endian ('m'), false for little-endian ('l'); any other selector ends the run.
bool is_big(char order) {
  if (order == 'm') return true;
  if (order == 'l') return false;
  std::fputs("\norder must be 'm' or 'l'!\n", stderr);
  throw ProcessExit{1};
}

template <class U>
U load(const unsigned char* buffer, char order) {
  const bool big = is_big(order);
  U value = 0;
  for (std::size_t i = 0; i < sizeof(U); ++i) {
    const std::size_t at = big ? i : sizeof(U) - 1 - i;
    value = static_cast<U>((value << 8) | static_cast<U>(buffer[at]));
  }
  return value;
}

template <class U>
void store(U value, unsigned char* buffer, char order) {
  const bool big = is_big(order);
  for (std::size_t i = 0; i < sizeof(U); ++i) {
    const auto byte = static_cast<unsigned char>((value >> (8 * i)) & 0xFFu);
    buffer[big ? sizeof(U) - 1 - i : i] = byte;
  }
}

void reverse_elements(void* buffer, std::size_t count, std::size_t size) {
  auto* bytes = static_cast<unsigned char*>(buffer);
  for (std::size_t e = 0; e < count; ++e) std::reverse(bytes + e * size, bytes + (e + 1) * size);
}

// ----------------------------------------------------------------------------- calendar

constexpr std::array<const char*, 12> kMonthNames = {"JAN", "FEB", "MAR", "APR", "MAY", "JUN",
                                                     "JUL", "AUG", "SEP", "OCT", "NOV", "DEC"};

bool is_leap(int64_t year) { return (year % 4 == 0 && year % 100 != 0) || year % 400 == 0; }

int month_length(int month0, int64_t year) {
  static constexpr std::array<int, 12> kDays = {31, 28, 31, 30, 31, 30, 31, 31, 30, 31, 30, 31};
  return month0 == 1 && is_leap(year) ? 29 : kDays[static_cast<std::size_t>(month0)];
}

bool is_c_space(char c) { return c == ' ' || c == '\t' || c == '\n' || c == '\v' || c == '\f' || c == '\r'; }

/// A small scanner over a text with the semantics of the sscanf directives the date readers use:
/// numeric fields skip leading white space, and a width counts the sign.
class FieldScanner {
 public:
  explicit FieldScanner(std::string_view text) : text_(text) {}

  bool integer(int width, long& out) {
    skip_space();
    std::size_t end = width > 0 ? std::min(text_.size(), pos_ + static_cast<std::size_t>(width)) : text_.size();
    std::size_t p = pos_;
    bool negative = false;
    if (p < end && (text_[p] == '+' || text_[p] == '-')) negative = text_[p++] == '-';
    const std::size_t digits = p;
    long value = 0;
    while (p < end && std::isdigit(static_cast<unsigned char>(text_[p]))) {
      if (value < std::numeric_limits<long>::max() / 10) value = value * 10 + (text_[p] - '0');
      ++p;
    }
    if (p == digits) return false;
    out = negative ? -value : value;
    pos_ = p;
    return true;
  }

  bool word(int width, std::string& out) {
    skip_space();
    std::size_t p = pos_;
    while (p < text_.size() && p - pos_ < static_cast<std::size_t>(width) && !is_c_space(text_[p])) ++p;
    if (p == pos_) return false;
    out.assign(text_.substr(pos_, p - pos_));
    pos_ = p;
    return true;
  }

  /// A floating-point field without width, converted as far as it goes.
  bool real(double& out) {
    skip_space();
    std::size_t p = pos_;
    if (p < text_.size() && (text_[p] == '+' || text_[p] == '-')) ++p;
    std::size_t mantissa = 0;
    while (p < text_.size() && std::isdigit(static_cast<unsigned char>(text_[p]))) ++p, ++mantissa;
    if (p < text_.size() && text_[p] == '.') {
      ++p;
      while (p < text_.size() && std::isdigit(static_cast<unsigned char>(text_[p]))) ++p, ++mantissa;
    }
    if (mantissa == 0) return false;
    if (p < text_.size() && (text_[p] == 'e' || text_[p] == 'E')) {
      std::size_t q = p + 1;
      if (q < text_.size() && (text_[q] == '+' || text_[q] == '-')) ++q;
      if (q < text_.size() && std::isdigit(static_cast<unsigned char>(text_[q]))) {
        while (q < text_.size() && std::isdigit(static_cast<unsigned char>(text_[q]))) ++q;
        p = q;
      }
    }
    std::string_view field = text_.substr(pos_, p - pos_);
    if (!field.empty() && field.front() == '+') field.remove_prefix(1);
    double value = 0.0;
    const auto res = std::from_chars(field.data(), field.data() + field.size(), value);
    if (res.ec == std::errc::result_out_of_range) {
      value = field.front() == '-' ? -HUGE_VAL : HUGE_VAL;
    } else if (res.ec != std::errc()) {
      return false;
    }
    out = value;
    pos_ = p;
    return true;
  }

  bool literal(char c) {
    if (pos_ < text_.size() && text_[pos_] == c) {
      ++pos_;
      return true;
    }
    return false;
  }

  void skip_space() {
    while (pos_ < text_.size() && is_c_space(text_[pos_])) ++pos_;
  }

 private:
  std::string_view text_;
  std::size_t pos_ = 0;
};

/// Leap days up to the last day of the year before `year`.
int64_t leap_days_before(int64_t year) {
  const int64_t y = year - 1;
  return y / 4 - y / 100 + y / 400;
}

constexpr int64_t kSecondsPerDay = 86400;
constexpr int64_t kDaysPer400Years = 146097;

/// Text of a whole-second count since the epoch and a microsecond count.
std::string format_sec85(int64_t wholeSeconds, unsigned micro) {
  const auto seconds = static_cast<unsigned>(wholeSeconds % 60);
  const auto minutes = static_cast<unsigned>((wholeSeconds / 60) % 60);
  const auto hours = static_cast<unsigned>((wholeSeconds / 3600) % 24);
  int64_t days = wholeSeconds / kSecondsPerDay;

  int64_t year = 1985;
  // Whole 400-year cycles first: the calendar repeats exactly, so this is the year-by-year
  // walk in fewer steps for far-future values.
  year += 400 * (days / kDaysPer400Years);
  days %= kDaysPer400Years;
  for (;;) {
    const int64_t length = is_leap(year) ? 366 : 365;
    if (days < length) break;
    days -= length;
    ++year;
  }
  int month0 = 0;
  while (month0 < 11 && days >= month_length(month0, year)) days -= month_length(month0++, year);

  char text[64];
  std::snprintf(text, sizeof text, "%2.2u-%3s-%4.4u %2.2u:%2.2u:%2.2u.%06u", static_cast<unsigned>(days + 1),
                kMonthNames[static_cast<std::size_t>(month0)], static_cast<unsigned>(year), hours, minutes, seconds,
                micro);
  return text;
}

/// sec85 values beyond this (about 30 million years) are refused rather than walked.
constexpr double kSec85Limit = 1e15;

/// Whole seconds and truncated microseconds of a non-negative sec85. A value that is the double
/// nearest to the next microsecond (as the decimal text of that microsecond reads back) counts
/// as that microsecond: the resolution of a double at 1e9 s is below a microsecond, and the
/// text must survive text -> sec85 -> text.
void split_sec85(double sec85, int64_t& whole, unsigned& micro) {
  const double floorValue = std::floor(sec85);
  whole = static_cast<int64_t>(floorValue);
  const double fraction = sec85 - floorValue;
  auto u = static_cast<unsigned>(fraction * 1e6);
  if (u > 999999u) u = 999999u;
  if (u < 999999u) {
    const unsigned next = u + 1;
    const auto ss = static_cast<double>(whole % 60);
    // The reader adds the scanned fraction of "ss.uuuuuu" to the whole seconds.
    const double scanned = (ss * 1e6 + next) / 1e6;
    const double byReader = static_cast<double>(whole) + (scanned - ss);
    bool bump = sec85 == byReader;
    if (!bump && whole < (int64_t{1} << 53) / 1000000) {
      const double nearest = static_cast<double>(whole * 1000000 + next) / 1e6;
      bump = sec85 >= nearest;
    }
    if (bump) u = next;
  }
  micro = u;
}

int mjd_field(const unsigned char* buffer) { return ch2long4(buffer, 'm'); }

}  // namespace

// ----------------------------------------------------------------------------- byte order

uint16_t ch2uint2(const unsigned char* buffer, char order) { return load<uint16_t>(buffer, order); }
uint32_t ch2uint4(const unsigned char* buffer, char order) { return load<uint32_t>(buffer, order); }
int16_t ch2int2(const unsigned char* buffer, char order) {
  return static_cast<int16_t>(load<uint16_t>(buffer, order));
}
int32_t ch2int4(const unsigned char* buffer, char order) {
  return static_cast<int32_t>(load<uint32_t>(buffer, order));
}
int32_t ch2long4(const unsigned char* buffer, char order) {
  return static_cast<int32_t>(load<uint32_t>(buffer, order));
}
float ch2float4(const unsigned char* buffer, char order) {
  return std::bit_cast<float>(load<uint32_t>(buffer, order));
}
double ch2double8(const unsigned char* buffer, char order) {
  return std::bit_cast<double>(load<uint64_t>(buffer, order));
}
void float2ch(float value, unsigned char* buffer, char order) {
  store(std::bit_cast<uint32_t>(value), buffer, order);
}
void long2ch(int32_t value, unsigned char* buffer, char order) {
  store(static_cast<uint32_t>(value), buffer, order);
}
void short2ch(int16_t value, unsigned char* buffer, char order) {
  store(static_cast<uint16_t>(value), buffer, order);
}

int my_endian() { return std::endian::native == std::endian::little ? 0 : 1; }
char endi() { return my_endian() == 0 ? 'l' : 'b'; }

uint32_t bsw2b(uint32_t value) {
  return (value & 0xFFFF0000u) | ((value & 0xFFu) << 8) | ((value >> 8) & 0xFFu);
}

void swp2(void* buffer, std::size_t count) { reverse_elements(buffer, count, 2); }
void swp4(void* buffer, std::size_t count) { reverse_elements(buffer, count, 4); }
void swp8(void* buffer, std::size_t count) { reverse_elements(buffer, count, 8); }

void swp_any(void* buffer, std::size_t bytes, std::size_t size) {
  if (size == 0 || size % 2 != 0) return;
  reverse_elements(buffer, bytes / size, size);
}

int get_endian(void* buffer, std::size_t count, std::size_t size, int fileOrder) {
  if (fileOrder == my_endian() || size == 1) return 0;
  switch (size) {
    case 2: swp2(buffer, count); return 0;
    case 4: swp4(buffer, count); return 0;
    case 8: swp8(buffer, count); return 0;
    // Kept as the formats use it: `count` is taken as a byte count for 16-byte elements.
    case 16: swp_any(buffer, count, 16); return 0;
    default: return -1;
  }
}

// ----------------------------------------------------------------------------- float tests

bool myisinf(double v) {
  const auto bits = std::bit_cast<uint64_t>(v);
  return (bits & 0x7FF0000000000000ull) == 0x7FF0000000000000ull && (bits & 0x000FFFFFFFFFFFFFull) == 0;
}
bool myisnan(double v) {
  const auto bits = std::bit_cast<uint64_t>(v);
  return (bits & 0x7FF0000000000000ull) == 0x7FF0000000000000ull && (bits & 0x000FFFFFFFFFFFFFull) != 0;
}
bool myfinite(double v) {
  return (std::bit_cast<uint64_t>(v) & 0x7FF0000000000000ull) != 0x7FF0000000000000ull;
}
bool myisinf4(float v) {
  const auto bits = std::bit_cast<uint32_t>(v);
  return (bits & 0x7F800000u) == 0x7F800000u && (bits & 0x007FFFFFu) == 0;
}
bool myisnan4(float v) {
  const auto bits = std::bit_cast<uint32_t>(v);
  return (bits & 0x7F800000u) == 0x7F800000u && (bits & 0x007FFFFFu) != 0;
}
bool myfinite4(float v) { return (std::bit_cast<uint32_t>(v) & 0x7F800000u) != 0x7F800000u; }

int mystrcasecmp(const char* a, const char* b) {
  if (a == b) return 0;
  if (!a) return -1;
  if (!b) return 1;
  for (;; ++a, ++b) {
    const int ca = std::tolower(static_cast<unsigned char>(*a));
    const int cb = std::tolower(static_cast<unsigned char>(*b));
    if (ca != cb || ca == 0) return ca - cb;
  }
}

// ----------------------------------------------------------------------------- time

int date2str(std::string_view text, DateParts& date) {
  date = DateParts{};
  if (text.empty()) return -1;

  std::size_t start = 0;
  const std::size_t reach = std::min<std::size_t>(text.size(), 40);
  while (start < reach && !std::isdigit(static_cast<unsigned char>(text[start]))) ++start;
  if (start == reach) return -1;

  // "%2ld-%3s-%4ld %2ld:%2ld:%lf": fields after the first mismatch stay zero.
  long day = 0, year = 0, hours = 0, minutes = 0;
  double seconds = 0.0;
  std::string monthText;
  FieldScanner scan(text.substr(start));
  if (scan.integer(2, day) && scan.literal('-') && scan.word(3, monthText) && scan.literal('-') &&
      scan.integer(4, year)) {
    scan.skip_space();
    if (scan.integer(2, hours) && scan.literal(':') && scan.integer(2, minutes) && scan.literal(':'))
      scan.real(seconds);
  }

  const double wholeSeconds = std::trunc(seconds);
  date.fraction = seconds - wholeSeconds;
  date.seconds = std::fabs(wholeSeconds) < 2e9 ? static_cast<int32_t>(wholeSeconds) : -1;
  date.year = static_cast<int32_t>(year);
  date.day = static_cast<int32_t>(day);
  date.hours = static_cast<int32_t>(hours);
  date.minutes = static_cast<int32_t>(minutes);

  int month0 = -1;
  for (std::size_t m = 0; m < kMonthNames.size(); ++m)
    if (mystrcasecmp(monthText.c_str(), kMonthNames[m]) == 0) month0 = static_cast<int>(m);

  int bits = 0;
  const int length = month0 >= 0 ? month_length(month0, year) : 31;
  if (day < 0 || day > length) bits |= 0x1;
  if (hours < 0 || hours > 24) bits |= 0x10;
  if (year < 0) bits |= 0x100;
  if (month0 < 0 || minutes < 0 || minutes > 60) bits |= 0x1000;
  if (date.seconds < 0 || date.seconds > 60) bits |= 0x10000;
  if (bits != 0) return bits;

  date.month = month0 + 1;
  int yday = static_cast<int>(day);
  for (int m = 0; m < month0; ++m) yday += month_length(m, year);
  date.yday = yday;
  return 0;
}

double ascii2sec85(std::string_view text) {
  DateParts date;
  const int status = date2str(text, date);
  if (status != 0) {
    std::fprintf(stderr, "Error: incorrect date format, code %d\n", status);
    return 0.0;
  }
  DateParts epoch;
  date2str("1-JAN-1985", epoch);

  const int64_t days = 365 * (int64_t{date.year} - epoch.year) + leap_days_before(date.year) -
                       leap_days_before(epoch.year) + date.yday - epoch.yday;
  const int64_t whole =
      ((days * 24 + (date.hours - epoch.hours)) * 60 + (date.minutes - epoch.minutes)) * 60 +
      (date.seconds - epoch.seconds);
  return static_cast<double>(whole) + (date.fraction - epoch.fraction);
}

int sec852myascii(double sec85, std::string& text) {
  // NaN fails this test as well as a negative value does.
  if (!(sec85 >= 0.0) || sec85 > kSec85Limit) {
    std::fputs("Date should be later than 1-JAN-1985\n", stderr);
    return -1;
  }
  int64_t whole = 0;
  unsigned micro = 0;
  split_sec85(sec85, whole, micro);
  text = format_sec85(whole, micro);
  return 0;
}

int sec852ascii(double sec85, char* buffer27) {
  std::string text;
  if (sec852myascii(sec85, text) != 0) return -1;
  std::memcpy(buffer27, text.data(), std::min<std::size_t>(27, text.size()));
  return 0;
}

double mjd2sec85(const unsigned char* buffer12) {
  const int days = mjd_field(buffer12);
  const int seconds = mjd_field(buffer12 + 4);
  const int micro = mjd_field(buffer12 + 8);
  return seconds + days * 86400.0 + micro * 1e-6 + kSec85AtMjd2000;
}

void sec852mjd(double sec85, unsigned char* buffer12) {
  const double rest = sec85 - kSec85AtMjd2000;
  const double days = std::floor(rest * 1.1574074074074073e-5);
  const double inDay = rest - days * 86400.0;
  const double seconds = std::trunc(inDay);
  auto toInt = [](double v) {
    return static_cast<int32_t>(std::clamp(v, static_cast<double>(std::numeric_limits<int32_t>::min()),
                                           static_cast<double>(std::numeric_limits<int32_t>::max())));
  };
  const int32_t d = std::isnan(days) ? 0 : toInt(days);
  const int32_t s = std::isnan(seconds) ? 0 : toInt(seconds);
  int32_t u = std::isnan(inDay) ? 0 : toInt((inDay - seconds) * 1e6);

  long2ch(d, buffer12, 'm');
  long2ch(s, buffer12 + 4, 'm');
  // Truncation, except that a value which reads back from the next microsecond exactly is that
  // microsecond: the conversion is then the inverse of mjd2sec85.
  if (u >= 0 && u < 999999) {
    long2ch(u + 1, buffer12 + 8, 'm');
    if (mjd2sec85(buffer12) == sec85) ++u;
  }
  long2ch(u, buffer12 + 8, 'm');
}

void mjd2ascii(const unsigned char* buffer12, char* text27) {
  // From the integer fields, so the text holds the stored microsecond exactly.
  const int64_t days = mjd_field(buffer12);
  const int64_t seconds = mjd_field(buffer12 + 4);
  int64_t micro = mjd_field(buffer12 + 8);
  int64_t whole = static_cast<int64_t>(kSec85AtMjd2000) + days * kSecondsPerDay + seconds;
  whole += micro / 1000000;
  micro %= 1000000;
  if (micro < 0) {
    micro += 1000000;
    --whole;
  }
  if (whole < 0) {
    std::fputs("Date should be later than 1-JAN-1985\n", stderr);
    return;
  }
  const std::string text = format_sec85(whole, static_cast<unsigned>(micro));
  std::memcpy(text27, text.data(), std::min<std::size_t>(27, text.size()));
}

double utc_ch2num(std::string_view text) {
  // "%2d-%3s-%4d %2d:%2d:%2d.%3d"
  long day = 0, year = 0, hours = 0, minutes = 0, seconds = 0, millis = 0;
  std::string monthText;
  FieldScanner scan(text);
  if (scan.integer(2, day) && scan.literal('-') && scan.word(3, monthText) && scan.literal('-') &&
      scan.integer(4, year)) {
    scan.skip_space();
    if (scan.integer(2, hours) && scan.literal(':') && scan.integer(2, minutes) && scan.literal(':') &&
        scan.integer(2, seconds) && scan.literal('.'))
      scan.integer(3, millis);
  }
  long month = 1;
  while (month <= 12 && std::strncmp(monthText.c_str(), kMonthNames[static_cast<std::size_t>(month - 1)], 3) != 0)
    ++month;
  const double date = static_cast<double>(year * 10000 + month * 100 + day);
  return date * 1e6 + static_cast<double>(hours * 10000 + minutes * 100 + seconds) + millis * 0.001;
}

// ----------------------------------------------------------------------------- fixed fields

double FtoDouble(const char* text, int length) {
  if (!text || length <= 0) return 0.0;
  const auto n = static_cast<std::size_t>(length);
  std::size_t first = 0;
  while (first < n && text[first] == ' ') ++first;
  const bool negative = first < n && text[first] == '-';

  // The field is expected to hold a point; without one in reach the digits are the integer part.
  std::size_t point = first;
  while (point < n && text[point] != '.') ++point;

  // Integer digits, read leftwards from the point until a blank or a sign.
  std::size_t begin = point;
  while (begin > 0 && std::isdigit(static_cast<unsigned char>(text[begin - 1]))) --begin;
  std::string number = "0";
  number.append(text + begin, text + point);
  number += '.';
  for (std::size_t i = point + 1; i < n; ++i) {
    if (text[i] == ' ') continue;
    if (!std::isdigit(static_cast<unsigned char>(text[i]))) break;
    number += text[i];
  }
  number += '0';
  double value = 0.0;
  std::from_chars(number.data(), number.data() + number.size(), value);
  return negative ? -value : value;
}

double FtoDouble2(const char* text) {
  if (!text) return 0.0;
  const char* p = text;
  while (*p == ' ') ++p;
  std::string number;
  if (*p == '-' || *p == '+') {
    if (*p == '-') number += '-';
    ++p;
  }
  std::size_t mantissa = 0;
  for (; std::isdigit(static_cast<unsigned char>(*p)); ++p, ++mantissa) number += *p;
  if (*p == '.') {
    number += *p++;
    for (; std::isdigit(static_cast<unsigned char>(*p)); ++p, ++mantissa) number += *p;
  }
  if (mantissa == 0) return 0.0;
  if (*p == 'e' || *p == 'E' || *p == 'd' || *p == 'D') {
    const char* q = p + 1;
    std::string exponent = "e";
    if (*q == '-' || *q == '+') exponent += *q++;
    if (std::isdigit(static_cast<unsigned char>(*q))) {
      for (; std::isdigit(static_cast<unsigned char>(*q)); ++q) exponent += *q;
      number += exponent;
    }
  }
  double value = 0.0;
  const auto res = std::from_chars(number.data(), number.data() + number.size(), value);
  if (res.ec == std::errc::result_out_of_range) {
    // Overflow gives an infinity, underflow zero, as strtod would.
    const auto e = number.find('e');
    const bool big = e != std::string::npos && number[e + 1] != '-';
    value = big ? HUGE_VAL : 0.0;
    if (number.front() == '-') value = -value;
  }
  return value;
}

int32_t ch2int(const char* text, int length) {
  if (!text || length <= 0) return 0;
  const auto n = static_cast<std::size_t>(length);
  std::size_t i = 0;
  while (i < n && text[i] == ' ') ++i;
  bool negative = false;
  if (i < n && (text[i] == '-' || text[i] == '+')) negative = text[i++] == '-';
  int64_t value = 0;
  for (; i < n && std::isdigit(static_cast<unsigned char>(text[i])); ++i) {
    value = value * 10 + (text[i] - '0');
    if (value > std::numeric_limits<uint32_t>::max()) value %= int64_t{1} << 32;
  }
  return static_cast<int32_t>(static_cast<uint32_t>(negative ? -value : value));
}

}  // namespace sar::base

#pragma once
// Byte order, float classification and the sec85 time scale.
//
// sec85: seconds since 1-JAN-1985 00:00:00 UTC, every day 86400 s (no leap seconds).
// Time text: "dd-MMM-yyyy hh:mm:ss.uuuuuu", 27 characters, month in capitals.
// MJD2000: three big-endian int32 (days since 1-JAN-2000, seconds of day, microseconds).
#include <cstddef>
#include <cstdint>
#include <span>
#include <string>
#include <string_view>

namespace sar::base {

/// Seconds from 1-JAN-1985 to 1-JAN-2000.
inline constexpr double kSec85AtMjd2000 = 4.732992e8;

// Byte-order selector for the ch2 family: 'l' little-endian, 'm' big-endian. Any other selector
// prints "\norder must be 'm' or 'l'!\n" on the error stream and ends the run with status 1.
uint16_t ch2uint2(const unsigned char* buffer, char order);
uint32_t ch2uint4(const unsigned char* buffer, char order);
int16_t ch2int2(const unsigned char* buffer, char order);
int32_t ch2int4(const unsigned char* buffer, char order);
int32_t ch2long4(const unsigned char* buffer, char order);
float ch2float4(const unsigned char* buffer, char order);
double ch2double8(const unsigned char* buffer, char order);
void float2ch(float value, unsigned char* buffer, char order);
void long2ch(int32_t value, unsigned char* buffer, char order);
void short2ch(int16_t value, unsigned char* buffer, char order);

/// Machine order: 'l' (108) on this platform; my_endian() is 0 for little-endian.
char endi();
int my_endian();

uint32_t bsw2b(uint32_t value);
void swp2(void* buffer, std::size_t count);
void swp4(void* buffer, std::size_t count);
void swp8(void* buffer, std::size_t count);
void swp_any(void* buffer, std::size_t bytes, std::size_t size);
/// Bring a buffer of `count` elements of `size` bytes to machine order from `fileOrder`
/// (0 little, 1 big, as my_endian()). Size 16 treats the first `count` bytes (kept quirk).
/// Returns 0, or -1 for an unsupported size.
int get_endian(void* buffer, std::size_t count, std::size_t size, int fileOrder);

bool myisinf(double v);
bool myfinite(double v);
bool myisnan(double v);
bool myisinf4(float v);
bool myfinite4(float v);
bool myisnan4(float v);
int mystrcasecmp(const char* a, const char* b);

/// Broken-down date.
struct DateParts {
  int32_t year = 0;
  int32_t month = 0;  // 1..12
  int32_t yday = 0;   // day of the year, 1 = first
  int32_t day = 0;    // day of the month
  int32_t hours = 0;
  int32_t minutes = 0;
  int32_t seconds = 0;
  double fraction = 0.0;
};

/// Parse a time text; 0, -1 (empty or no digit) or the error bits 0x1, 0x10, 0x100, 0x1000, 0x10000.
int date2str(std::string_view text, DateParts& date);
/// sec85 of a time text; 0.0 (with a message on the error stream) on a parse failure.
double ascii2sec85(std::string_view text);
/// Time text of a sec85 value (27 characters), or -1 with a message for a negative value.
int sec852myascii(double sec85, std::string& text);
/// Exactly 27 bytes, no terminator.
int sec852ascii(double sec85, char* buffer27);
double mjd2sec85(const unsigned char* buffer12);
void sec852mjd(double sec85, unsigned char* buffer12);
void mjd2ascii(const unsigned char* buffer12, char* text27);
double utc_ch2num(std::string_view text);

double FtoDouble(const char* text, int length);
double FtoDouble2(const char* text);
int32_t ch2int(const char* text, int length);

/// Half away from zero: floor(x + 0.5) for x >= 0, ceil(x - 0.5) below.
inline long round_half_away(double x);

}  // namespace sar::base

#include <cmath>
inline long sar::base::round_half_away(double x) {
  return static_cast<long>(x >= 0.0 ? std::floor(x + 0.5) : std::ceil(x - 0.5));
}

#include "simulator/header_text.hpp"

#include <cmath>
#include <cstdio>
#include <stdexcept>

#include "base/convert.hpp"

namespace sar::simulator {

namespace {

std::string format_text(const char* format, auto... args) {
  char buffer[128];
  const int n = std::snprintf(buffer, sizeof buffer, format, args...);
  if (n < 0 || static_cast<std::size_t>(n) >= sizeof buffer) throw std::runtime_error("header field too long");
  return std::string(buffer, static_cast<std::size_t>(n));
}

std::string optional_time(const std::optional<double>& t) { return t ? time_text(*t) : std::string(27, ' '); }

}  // namespace

std::string fit(std::string_view value, std::size_t width) {
  std::string out(value.substr(0, width));
  out.resize(width, ' ');
  return out;
}

std::string signed_int(long long value, int digits) {
  return format_text("%+0*lld", digits + 1, value);
}

std::string signed_fixed(double value, int width, int decimals) {
  return format_text("%+0*.*f", width, decimals, value);
}

std::string signed_fraction(double value, int decimals) {
  std::string text = format_text("%+.*f", decimals, value);
  // "+0.123456" -> "+.123456": the field has room for the sign and the decimals only.
  if (text.size() > 2 && text[1] == '0' && text[2] == '.') text.erase(1, 1);
  return text;
}

std::string signed_exp(double value) { return format_text("%+.8E", value); }

std::string time_text(double sec85) {
  // Round to the microsecond first so that the text never truncates 0.9999995 s downwards.
  const double rounded = std::floor(sec85 * 1e6 + 0.5) * 1e-6;
  std::string text;
  if (base::sec852myascii(rounded, text) != 0 || text.size() < 27) throw std::runtime_error("time before 1985");
  return text.substr(0, 27);
}

std::string compact_time(double sec85) {
  const std::string t = time_text(sec85);  // dd-MMM-yyyy hh:mm:ss.uuuuuu
  static constexpr const char* kMonths[] = {"JAN", "FEB", "MAR", "APR", "MAY", "JUN",
                                            "JUL", "AUG", "SEP", "OCT", "NOV", "DEC"};
  std::string month = "00";
  for (int m = 0; m < 12; ++m)
    if (t.compare(3, 3, kMonths[m]) == 0) month = {static_cast<char>('0' + (m + 1) / 10), static_cast<char>('0' + (m + 1) % 10)};
  return t.substr(7, 4) + month + t.substr(0, 2) + "_" + t.substr(12, 2) + t.substr(15, 2) + t.substr(18, 2);
}

void HeaderText::quoted(std::string_view key, std::string_view value, std::size_t width) {
  text_.append(key);
  text_.append("=\"");
  text_.append(fit(value, width));
  text_.append("\"\n");
}

void HeaderText::plain(std::string_view key, std::string_view value) {
  text_.append(key);
  text_.push_back('=');
  text_.append(value);
  text_.push_back('\n');
}

void HeaderText::spare(std::size_t length) {
  text_.append(length - 1, ' ');
  text_.push_back('\n');
}

std::string build_mph(const MphFields& f) {
  HeaderText h;
  h.quoted("PRODUCT", f.product, 62);
  h.plain("PROC_STAGE", std::string(1, f.proc_stage));
  h.quoted("REF_DOC", f.ref_doc, 23);
  h.spare(41);
  h.quoted("ACQUISITION_STATION", f.acquisition_station, 20);
  h.quoted("PROC_CENTER", f.proc_center, 6);
  h.quoted("PROC_TIME", time_text(f.proc_time), 27);
  h.quoted("SOFTWARE_VER", f.software_ver, 14);
  h.spare(41);
  h.quoted("SENSING_START", time_text(f.sensing_start), 27);
  h.quoted("SENSING_STOP", time_text(f.sensing_stop), 27);
  h.spare(41);
  h.plain("PHASE", std::string(1, f.phase));
  h.plain("CYCLE", signed_int(f.cycle, 3));
  h.plain("REL_ORBIT", signed_int(f.rel_orbit, 5));
  h.plain("ABS_ORBIT", signed_int(f.abs_orbit, 5));
  h.quoted("STATE_VECTOR_TIME", optional_time(f.state_vector_time), 27);
  h.plain("DELTA_UT1", signed_fraction(f.delta_ut1, 6) + "<s>");
  static constexpr const char* kPos[3] = {"X_POSITION", "Y_POSITION", "Z_POSITION"};
  static constexpr const char* kVel[3] = {"X_VELOCITY", "Y_VELOCITY", "Z_VELOCITY"};
  for (int i = 0; i < 3; ++i) h.plain(kPos[i], signed_fixed(f.position[i], 12, 3) + "<m>");
  for (int i = 0; i < 3; ++i) h.plain(kVel[i], signed_fixed(f.velocity[i], 12, 6) + "<m/s>");
  h.quoted("VECTOR_SOURCE", f.vector_source, 2);
  h.spare(41);
  h.quoted("UTC_SBT_TIME", optional_time(f.utc_sbt_time), 27);
  h.plain("SAT_BINARY_TIME", signed_int(f.sat_binary_time, 10));
  h.plain("CLOCK_STEP", signed_int(f.clock_step_ps, 10) + "<ps>");
  h.spare(33);
  h.quoted("LEAP_UTC", optional_time(f.leap_utc), 27);
  h.plain("LEAP_SIGN", signed_int(f.leap_sign, 3));
  h.plain("LEAP_ERR", std::to_string(f.leap_err));
  h.spare(41);
  h.plain("PRODUCT_ERR", std::to_string(f.product_err));
  h.plain("TOT_SIZE", signed_int(f.tot_size, 20) + "<bytes>");
  h.plain("SPH_SIZE", signed_int(f.sph_size, 10) + "<bytes>");
  h.plain("NUM_DSD", signed_int(f.num_dsd, 10));
  h.plain("DSD_SIZE", signed_int(f.dsd_size, 10) + "<bytes>");
  h.plain("NUM_DATA_SETS", signed_int(f.num_data_sets, 10));
  h.spare(41);
  if (h.size() != kMphBytes) throw std::logic_error("MPH is not 1247 bytes");
  return h.str();
}

std::string build_dsd(const DsdFields& f) {
  HeaderText h;
  h.quoted("DS_NAME", f.name, 28);
  h.plain("DS_TYPE", std::string(1, f.type));
  h.quoted("FILENAME", f.filename, 62);
  h.plain("DS_OFFSET", signed_int(f.offset, 20) + "<bytes>");
  h.plain("DS_SIZE", signed_int(f.size, 20) + "<bytes>");
  h.plain("NUM_DSR", signed_int(f.num_dsr, 10));
  h.plain("DSR_SIZE", signed_int(f.dsr_size, 10) + "<bytes>");
  h.spare(33);
  if (h.size() != kDsdBytes) throw std::logic_error("DSD is not 280 bytes");
  return h.str();
}

std::string spare_dsd() {
  HeaderText h;
  h.spare(kDsdBytes);
  return h.str();
}

LeapSecond leap_second_before(double sec85) {
  // Leap seconds inserted during the mission and the years before it.
  static constexpr const char* kLeaps[] = {"01-JAN-1999 00:00:00.000000", "01-JAN-2006 00:00:00.000000",
                                           "01-JAN-2009 00:00:00.000000", "01-JUL-2012 00:00:00.000000"};
  LeapSecond leap{base::ascii2sec85(kLeaps[0]), 1};
  for (const char* text : kLeaps) {
    const double t = base::ascii2sec85(text);
    if (t <= sec85) leap.utc = t;
  }
  return leap;
}

}  // namespace sar::simulator

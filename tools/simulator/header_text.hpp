#pragma once
// Fixed-width ASCII headers of ENVISAT products: the main product header (MPH, 1247 bytes) and
// the data set descriptors (DSD, 280 bytes each). Readers parse these by byte position, so every
// field is written at its fixed width and every line keeps its exact length.
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

namespace sar::simulator {

inline constexpr std::size_t kMphBytes = 1247;
inline constexpr std::size_t kDsdBytes = 280;

/// `value` cut or padded with blanks to `width` characters.
std::string fit(std::string_view value, std::size_t width);
/// Signed integer with a leading sign and zero padding to `digits` digits: "+0000001956".
std::string signed_int(long long value, int digits);
/// Signed fixed-point number, zero padded to `width` characters in all: "-0008171.850".
std::string signed_fixed(double value, int width, int decimals);
/// Signed number below 1 in size without its leading zero: "-.505923".
std::string signed_fraction(double value, int decimals);
/// Signed exponent form with eight decimals: "+1.94011724E+02".
std::string signed_exp(double value);
/// Time text "dd-MMM-yyyy hh:mm:ss.uuuuuu" of a sec85 value, rounded to the microsecond.
std::string time_text(double sec85);
/// "yyyymmdd_hhmmss" of a sec85 value, as product names carry it.
std::string compact_time(double sec85);

/// Line-by-line builder of the KEY=value text of a header.
class HeaderText {
 public:
  void quoted(std::string_view key, std::string_view value, std::size_t width);
  void plain(std::string_view key, std::string_view value);
  /// A spare line: `length` - 1 blanks and a line feed.
  void spare(std::size_t length);
  void raw(std::string_view bytes) { text_.append(bytes); }
  const std::string& str() const { return text_; }
  std::size_t size() const { return text_.size(); }

 private:
  std::string text_;
};

struct MphFields {
  std::string product;
  char proc_stage = 'N';
  std::string ref_doc;
  std::string acquisition_station;
  std::string proc_center;
  double proc_time = 0.0;
  std::string software_ver;
  double sensing_start = 0.0;
  double sensing_stop = 0.0;
  char phase = '2';
  int cycle = 0;
  int rel_orbit = 0;
  int abs_orbit = 0;
  std::optional<double> state_vector_time;  // blank when not set
  double delta_ut1 = 0.0;
  double position[3] = {0.0, 0.0, 0.0};
  double velocity[3] = {0.0, 0.0, 0.0};
  std::string vector_source;
  std::optional<double> utc_sbt_time;
  long long sat_binary_time = 0;
  long long clock_step_ps = 0;
  std::optional<double> leap_utc;
  int leap_sign = 0;
  int leap_err = 0;
  int product_err = 0;
  long long tot_size = 0;
  long long sph_size = 0;
  int num_dsd = 0;
  int dsd_size = static_cast<int>(kDsdBytes);
  int num_data_sets = 0;
};

/// The 1247-byte MPH.
std::string build_mph(const MphFields& fields);

struct DsdFields {
  std::string name;
  char type = 'M';
  std::string filename;
  long long offset = 0;
  long long size = 0;
  long long num_dsr = 0;
  long long dsr_size = 0;
};

/// One 280-byte DSD.
std::string build_dsd(const DsdFields& fields);
/// The 280-byte blank DSD that closes a list of descriptors.
std::string spare_dsd();

/// Leap second in force at a time of the ENVISAT era: its epoch (sec85) and sign.
struct LeapSecond {
  double utc = 0.0;
  int sign = 0;
};
LeapSecond leap_second_before(double sec85);

}  // namespace sar::simulator

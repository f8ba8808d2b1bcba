#pragma once
// RADARSAT-1 CEOS raw signal data: the data file's descriptor, the 192-byte signal record
// header, the 50-byte auxiliary header of the instrument with its bit fields, and the 4-bit
// samples.
#include <array>
#include <cstdint>
#include <optional>
#include <span>
#include <string_view>

namespace sar::radarsat {

inline constexpr std::size_t kSignalHeaderBytes = 192;
inline constexpr std::size_t kAuxHeaderBytes = 50;
inline constexpr std::size_t kLinePrefixBytes = kSignalHeaderBytes + kAuxHeaderBytes;
/// Bytes a record may hold beyond its samples (headers and fill) before it counts as broken.
inline constexpr int64_t kMaxRecordOverhead = 622;

inline constexpr double kPulseLength = 4.2e-05;           ///< s
inline constexpr double kCarrierFrequency = 5300432425.742575;  ///< Hz
inline constexpr double kWavelength = 0.05656;            ///< m
/// Fixed delay subtracted from the sampling window start, s.
inline constexpr double kWindowDelay = 4.2e-06;

/// Values of the data file descriptor record.
struct DataFileDescriptor {
  int64_t length = 0;       ///< bytes of the descriptor itself (its header's length field)
  int64_t records = 0;      ///< signal records present (ASCII at byte 180)
  int64_t record_length = 0;  ///< bytes of the longest signal record (ASCII at byte 186)
};

/// Fields of the 192-byte signal record header (32-bit big-endian).
struct SignalHeader {
  int64_t record_length = 0;  ///< byte 8
  int64_t line_index = 0;     ///< byte 12, from 1 in the file's own numbering
  int64_t sample_count = 0;   ///< byte 24: 2 C bytes of samples follow the headers
};
SignalHeader decode_signal_header(std::span<const uint8_t, kSignalHeaderBytes> bytes);

/// Bit fields of the auxiliary header. Multi-byte fields are big-endian bit strings.
struct AuxHeader {
  int bandwidth_code = 0;  ///< byte 12, high nibble
  int beam_code = 0;       ///< bytes 18-19
  int adc_code = 0;        ///< byte 22, bits 5-4
  int pri_count = 0;       ///< P: bytes 25-26, 11 bits
  int swst_count = 0;      ///< W: bytes 27-28, 12 bits
  int rx_duration = 0;     ///< D: bytes 29-30, 12 bits
  int seconds = 0;         ///< bytes 44-46, 17 bits: seconds of the day
  int milliseconds = 0;    ///< bytes 46-47, 10 bits
  int fraction = 0;        ///< bytes 47-48, 10 bits: 1/1024 ms
  int attenuation = 0;     ///< byte 49, bits 5-0, dB

  /// Seconds of the day of the line: s + ms 1e-3 + fraction / 1024 ms.
  double time_of_day() const { return seconds + milliseconds * 0.001 + fraction * 0.0009765625e-3; }
};
AuxHeader decode_aux_header(std::span<const uint8_t, kAuxHeaderBytes> bytes);

/// The ADC rate: time unit of the counters, sampling period, replica bytes.
struct AdcRate {
  double time_unit = 0.0;
  double sampling_period = 0.0;
  int replica_bytes = 0;
};
std::optional<AdcRate> adc_rate(int code);
/// Pulse bandwidth in Hz, or nothing for an unknown code.
std::optional<double> pulse_bandwidth(int code);

struct Beam {
  std::string_view name;
  int pulses_in_flight = 0;
};
/// Beam of a code 1 to 20, or nothing.
std::optional<Beam> beam_of(int code);

/// PRF of a PRI count: 1 / ((P + 2) T).
inline double prf_of(int pri_count, double time_unit) { return 1.0 / ((pri_count + 2) * time_unit); }
/// Complex echo samples of a receive duration count: q = floor((6 D + 4) / 8) x 8.
inline int echo_samples(int rx_duration) { return (6 * rx_duration + 4) / 8 * 8; }
/// Two-way time of a line's first sample.
inline double near_range_time(int swst_count, double time_unit, int pulses_in_flight, double prf) {
  return (swst_count + 5) * time_unit - kWindowDelay + pulses_in_flight / prf;
}
/// Divisor that brings a line of attenuation `a` to the reference attenuation `a0`.
float attenuation_gain(int a0, int a);
/// One 4-bit sample: the low nibble v gives v + 0.5 for 0..7 and v - 15.5 above.
inline float decode_nibble(uint8_t byte) {
  const int v = byte & 15;
  return v <= 7 ? static_cast<float>(v) + 0.5f : static_cast<float>(v) - 15.5f;
}

}  // namespace sar::radarsat

#include "radarsat/signal_data.hpp"

#include <cmath>

namespace sar::radarsat {
namespace {

uint32_t be32(std::span<const uint8_t> b, std::size_t at) {
  return (static_cast<uint32_t>(b[at]) << 24) | (static_cast<uint32_t>(b[at + 1]) << 16) |
         (static_cast<uint32_t>(b[at + 2]) << 8) | static_cast<uint32_t>(b[at + 3]);
}

constexpr std::array<Beam, 20> kBeams = {{{"S1", 7}, {"S2", 7}, {"S3", 8}, {"S4", 8}, {"S5", 8}, {"S6", 9}, {"S7", 9},
                                          {"W1", 7}, {"W2", 8}, {"W3", 8}, {"W4", 8}, {"E1", 7}, {"E2", 10}, {"E3", 11},
                                          {"E4", 11}, {"F1", 8}, {"F2", 8}, {"F3", 9}, {"F4", 9}, {"F5", 9}}};

}  // namespace

SignalHeader decode_signal_header(std::span<const uint8_t, kSignalHeaderBytes> b) {
  SignalHeader h;
  h.record_length = be32(b, 8);
  h.line_index = be32(b, 12);
  h.sample_count = be32(b, 24);
  return h;
}

AuxHeader decode_aux_header(std::span<const uint8_t, kAuxHeaderBytes> a) {
  AuxHeader h;
  h.bandwidth_code = a[12] >> 4;
  h.beam_code = (a[18] << 8) | a[19];
  h.adc_code = (a[22] >> 4) & 3;
  // The counters straddle byte boundaries: whole high byte, then the top bits of the next.
  h.pri_count = (a[25] << 5) + (a[26] >> 3);
  h.swst_count = (a[27] << 4) + (a[28] >> 4);
  h.rx_duration = (a[29] << 4) + (a[30] >> 4);
  h.seconds = ((((a[44] & 31) << 8) + a[45]) << 4) + (a[46] >> 4);
  h.milliseconds = ((a[46] & 15) << 6) + (a[47] >> 2);
  h.fraction = ((a[47] & 3) << 8) + a[48];
  h.attenuation = a[49] & 63;
  return h;
}

std::optional<AdcRate> adc_rate(int code) {
  switch (code) {
    case 0: return AdcRate{1.8566e-07, 3.0940000000000004e-08, 2880};
    case 1: return AdcRate{3.2491e-07, 5.415e-08, 1644};
    case 2: return AdcRate{4.6415e-07, 7.736e-08, 1152};
    default: return std::nullopt;
  }
}

std::optional<double> pulse_bandwidth(int code) {
  switch (code) {
    case 0: return 30000000.0;
    case 1: return 17280000.0;
    case 2: return 11580000.0;
    default: return std::nullopt;
  }
}

std::optional<Beam> beam_of(int code) {
  if (code < 1 || code > static_cast<int>(kBeams.size())) return std::nullopt;
  return kBeams[static_cast<std::size_t>(code - 1)];
}

float attenuation_gain(int a0, int a) {
  return a == a0 ? 1.0f : static_cast<float>(std::pow(10.0, (a0 - a) / 20.0));
}

}  // namespace sar::radarsat

// Auxiliary header bit fields at their boundaries, the code tables and the 4-bit samples.
#include <gtest/gtest.h>

#include <array>
#include <cmath>

#include "radarsat/signal_data.hpp"
#include "simulator/rsat_product.hpp"

using namespace sar::radarsat;

namespace {

struct Bytes {
  std::array<uint8_t, kAuxHeaderBytes> a{};
  Bytes& set(std::size_t at, uint8_t v) {
    a[at] = v;
    return *this;
  }
  AuxHeader decode() const { return decode_aux_header(a); }
};

}  // namespace

TEST(AuxHeader, FieldsAtTheirBitBoundaries) {
  struct Case {
    const char* name;
    Bytes bytes;
    int AuxHeader::*field;
    int expected;
  };
  const Case cases[] = {
      // P = aux[25] x 32 + aux[26] >> 3: 4283 = 133 x 32 + 27, the F1 PRF of 1256.99 Hz.
      {"P of the fine beam", Bytes().set(25, 133).set(26, 27 << 3 | 7), &AuxHeader::pri_count, 4283},
      {"P low bits ignored", Bytes().set(26, 0x07), &AuxHeader::pri_count, 0},
      {"P largest", Bytes().set(25, 255).set(26, 0xFF), &AuxHeader::pri_count, 8191},
      {"W high and low", Bytes().set(27, 0x12).set(28, 0x3F), &AuxHeader::swst_count, 0x123},
      {"W largest", Bytes().set(27, 255).set(28, 0xF0), &AuxHeader::swst_count, 4095},
      {"D", Bytes().set(29, 0xAA).set(30, 0xBC), &AuxHeader::rx_duration, 0xAAB},
      {"ADC code 2 in bits 5-4", Bytes().set(22, 0xEF), &AuxHeader::adc_code, 2},
      {"ADC code 1", Bytes().set(22, 0x10), &AuxHeader::adc_code, 1},
      {"bandwidth code high nibble", Bytes().set(12, 0x2F), &AuxHeader::bandwidth_code, 2},
      {"beam code 16 bits", Bytes().set(18, 0).set(19, 20), &AuxHeader::beam_code, 20},
      {"beam code high byte", Bytes().set(18, 1).set(19, 0), &AuxHeader::beam_code, 256},
      {"seconds: 17 bits, top 3 of byte 44 ignored", Bytes().set(44, 0xFF).set(45, 0xFF).set(46, 0xF0), &AuxHeader::seconds,
       131071},
      {"seconds of 23:59:59", Bytes().set(44, 0x15).set(45, 0x17).set(46, 0xF0), &AuxHeader::seconds, 86399},
      {"milliseconds 999", Bytes().set(46, 0x0F).set(47, 0x9C), &AuxHeader::milliseconds, 999},
      {"milliseconds take no seconds bits", Bytes().set(46, 0xF0), &AuxHeader::milliseconds, 0},
      {"fraction 1023", Bytes().set(47, 0x03).set(48, 0xFF), &AuxHeader::fraction, 1023},
      {"fraction takes no millisecond bits", Bytes().set(47, 0xFC), &AuxHeader::fraction, 0},
      {"attenuation 6 bits", Bytes().set(49, 0xFF), &AuxHeader::attenuation, 63},
      {"attenuation step", Bytes().set(49, 0x16), &AuxHeader::attenuation, 22},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    EXPECT_EQ(c.bytes.decode().*c.field, c.expected);
  }
}

TEST(AuxHeader, TimeOfDayCountsOneOver1024Milliseconds) {
  AuxHeader h;
  h.seconds = 86399;
  h.milliseconds = 999;
  h.fraction = 1023;
  EXPECT_NEAR(h.time_of_day(), 86399.999 + 1023.0 / 1024.0 * 1e-3, 1e-12);
  EXPECT_LT(h.time_of_day(), 86400.0);
}

TEST(AuxHeader, SimulatorPacksWhatTheReaderUnpacks) {
  sar::simulator::rsat::AuxFields f;
  f = {2, 20, 2, 8191, 4095, 4095, 131071, 1023, 1023, 63};
  AuxHeader h = decode_aux_header(sar::simulator::rsat::encode_aux(f));
  EXPECT_EQ(h.bandwidth_code, 2);
  EXPECT_EQ(h.beam_code, 20);
  EXPECT_EQ(h.adc_code, 2);
  EXPECT_EQ(h.pri_count, 8191);
  EXPECT_EQ(h.swst_count, 4095);
  EXPECT_EQ(h.rx_duration, 4095);
  EXPECT_EQ(h.seconds, 131071);
  EXPECT_EQ(h.milliseconds, 1023);
  EXPECT_EQ(h.fraction, 1023);
  EXPECT_EQ(h.attenuation, 63);
}

TEST(CodeTables, RatesBandwidthsBeamsAndDerivedValues) {
  ASSERT_TRUE(adc_rate(0) && adc_rate(1) && adc_rate(2));
  EXPECT_FALSE(adc_rate(3));
  EXPECT_NEAR(1.0 / adc_rate(0)->sampling_period, 32.32e6, 0.01e6);
  EXPECT_NEAR(1.0 / adc_rate(1)->sampling_period, 18.47e6, 0.01e6);
  EXPECT_EQ(adc_rate(2)->replica_bytes, 1152);
  EXPECT_EQ(*pulse_bandwidth(1), 17280000.0);
  EXPECT_FALSE(pulse_bandwidth(3));
  EXPECT_FALSE(beam_of(0));
  EXPECT_FALSE(beam_of(21));
  EXPECT_EQ(beam_of(3)->name, "S3");
  EXPECT_EQ(beam_of(16)->name, "F1");
  EXPECT_EQ(beam_of(15)->pulses_in_flight, 11);
  EXPECT_NEAR(prf_of(4283, adc_rate(0)->time_unit), 1256.99, 0.01);
  // q = floor((6 D + 4) / 8) x 8
  EXPECT_EQ(echo_samples(341), 2048);
  EXPECT_EQ(echo_samples(340), 2040);
  EXPECT_EQ(echo_samples(1), 8);
  EXPECT_EQ(echo_samples(0), 0);
  EXPECT_FLOAT_EQ(attenuation_gain(10, 10), 1.0f);
  EXPECT_NEAR(attenuation_gain(10, 16), std::pow(10.0, -0.3), 1e-6);
  EXPECT_NEAR(attenuation_gain(16, 10), std::pow(10.0, 0.3), 1e-5);
}

TEST(Samples, FourBitLevelsAndTheHighNibbleIgnored) {
  const std::pair<uint8_t, float> cases[] = {{0x00, 0.5f}, {0x07, 7.5f}, {0x08, -7.5f}, {0x0F, -0.5f}, {0xF3, 3.5f}, {0xA9, -6.5f}};
  for (auto [byte, value] : cases) EXPECT_EQ(decode_nibble(byte), value) << int(byte);
  for (float x : {-8.0f, -7.9f, -0.2f, 0.0f, 3.3f, 7.99f}) {
    const float level = decode_nibble(sar::simulator::rsat::encode_nibble(x));
    EXPECT_LE(std::abs(level - x), 0.5f + 1e-6f) << x;
  }
}

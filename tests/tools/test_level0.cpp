// Level 0 products of the simulator: headers against the real product, packets, echoes, faults.
#include <gtest/gtest.h>

#include <cmath>
#include <complex>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <map>
#include <string>
#include <vector>

#include "header_shape.hpp"
#include "base/convert.hpp"
#include "envisat/product_types.hpp"
#include "simulator/fbaq_encoder.hpp"
#include "simulator/simulator.hpp"

namespace sim = sar::simulator;

namespace {

constexpr const char* kRealLevel0 = "/ASA_IM__0P_truncated/ASA_IM__0CNPDE20120329_071134_000000163113_00121_52721_6279.N1";

using sar::test::header_shape;
using sar::test::read_all;

unsigned u8(const std::string& b, std::size_t i) { return static_cast<unsigned char>(b[i]); }
unsigned u16(const std::string& b, std::size_t i) { return (u8(b, i) << 8) | u8(b, i + 1); }

// One record as the stream holds it, read by the documented byte positions.
struct Record {
  std::size_t offset = 0;
  double time = 0.0;
  unsigned apid = 0, seq = 0, length = 0, dfh = 0, mode = 0, counter = 0, beam = 0, flags = 0, position = 0;
  unsigned pri = 0, swst = 0, swl = 0, pulse = 0, bandwidth = 0;
  std::string payload;
};

std::vector<Record> walk(const std::string& file) {
  std::vector<Record> out;
  std::size_t pos = 3203;
  while (pos + 68 <= file.size()) {
    Record r;
    r.offset = pos;
    r.time = sar::base::mjd2sec85(reinterpret_cast<const unsigned char*>(file.data() + pos));
    r.apid = ((u8(file, pos + 32) & 7) << 8) | u8(file, pos + 33);
    r.seq = ((u8(file, pos + 34) & 63) << 8) | u8(file, pos + 35);
    r.length = u16(file, pos + 36);
    r.dfh = u16(file, pos + 38);
    r.mode = u8(file, pos + 41);
    r.counter = (u8(file, pos + 48) << 16) | (u8(file, pos + 49) << 8) | u8(file, pos + 50);
    r.beam = u8(file, pos + 51) >> 2;
    r.flags = u8(file, pos + 52) & 0xF0;
    r.position = ((u8(file, pos + 52) & 15) << 8) | u8(file, pos + 53);
    r.pri = u16(file, pos + 54);
    r.swst = u16(file, pos + 56);
    r.swl = u16(file, pos + 58);
    r.pulse = (u8(file, pos + 62) << 2) | (u8(file, pos + 63) >> 6);
    r.bandwidth = u8(file, pos + 64);
    const std::size_t end = pos + r.length + 39;
    if (end > file.size()) break;
    r.payload = file.substr(pos + 68, r.length - 29);
    out.push_back(r);
    pos = end;
  }
  return out;
}

sim::SimulationConfig small_config(const std::string& name) {
  sim::SimulationConfig c;
  c.out_dir = std::string(SAR_BINARY_DIR) + "/test_tools_" + name;
  std::filesystem::remove_all(c.out_dir);
  c.lines = 512;
  c.samples = 1024;
  c.targets = {{{45.0, 10.0, 0.0}, 30.0}};
  return c;
}

// Samples of a line as the decoder would give them: table values divided by the receive gain.
std::vector<std::complex<double>> decode_echo(const Record& r, const sim::ImParameters& im) {
  const auto bytes = std::vector<uint8_t>(r.payload.begin(), r.payload.end());
  const std::vector<float> iq = sim::fbaq_decode_line(bytes, static_cast<int>(r.swl), sim::simulator_fbaq_table());
  const std::vector<double> gain = sim::receive_gain(im, static_cast<int>(r.swl));
  std::vector<std::complex<double>> line(r.swl);
  for (std::size_t k = 0; k < line.size(); ++k) line[k] = std::complex<double>(iq[2 * k], iq[2 * k + 1]) / gain[k];
  return line;
}

}  // namespace

TEST(Level0Product, HeadersTypeAsIm0AndMatchTheRealLayout) {
  const sim::SimulationConfig c = small_config("headers");
  const sim::SimulationTruth t = sim::run_simulation(c);
  sar::envisat::EnvisatTypes types(t.level0_path);
  EXPECT_TRUE(types.is_im0());
  EXPECT_EQ(types.find_type(), sar::envisat::kAsaIm0);
  EXPECT_EQ(types.check_dorvor(t.orbit_path), 1);

  const std::string mine = read_all(t.level0_path);
  const std::string real = read_all(std::string(SAR_REAL_DATA_DIR) + kRealLevel0);
  ASSERT_GT(real.size(), 3203u + 68u);
  EXPECT_EQ(header_shape(mine.substr(0, 3203)), header_shape(real.substr(0, 3203)));
  EXPECT_EQ(static_cast<long long>(mine.size()), t.full_size);
  EXPECT_EQ(std::stoll(mine.substr(mine.find("TOT_SIZE=") + 9, 21)), t.full_size);
  // SPH fields the extraction takes by position.
  const std::string sph = mine.substr(1247, 1956);
  EXPECT_EQ(sph.substr(20, 2), "IM");
  EXPECT_EQ(real.substr(1247 + 20, 2), "IM");
  EXPECT_NEAR((std::stod(sph.substr(56, 11)) + std::stod(sph.substr(120, 11))) * 5e-7, 45.0, 0.05);
  EXPECT_EQ(sph.substr(775, 5), "H/H  ");
  EXPECT_EQ(real.substr(1247 + 775, 5), "H/H  ");
  EXPECT_EQ(sph[791], '2');
  EXPECT_EQ(real[1247 + 791], '6');
  EXPECT_EQ(sar::base::ascii2sec85(mine.substr(351, 27)), t.first_line_time);

  // The fixed bits of the first head agree with the real first packet.
  for (std::size_t i : {32u, 33u, 38u, 39u, 41u, 64u}) EXPECT_EQ(u8(mine, 3203 + i), u8(real, 3203 + i)) << i;
  EXPECT_EQ(u8(mine, 3203 + 34) & 0xC0, u8(real, 3203 + 34) & 0xC0);
  EXPECT_EQ(u8(mine, 3203 + 51) & 3, u8(real, 3203 + 51) & 3);      // 8:4 compression
  EXPECT_EQ(u8(mine, 3203 + 52) & 0xF0, u8(real, 3203 + 52) & 0xF0);  // echo flags
  EXPECT_EQ(u16(mine, 3203 + 24), u16(mine, 3203 + 36));              // FEP length = packet length
}

TEST(Level0Product, PacketsFollowTheTimelineAndTheTruth) {
  const sim::SimulationConfig c = small_config("packets");
  const sim::SimulationTruth t = sim::run_simulation(c);
  const std::string file = read_all(t.level0_path);
  const std::vector<Record> records = walk(file);
  ASSERT_EQ(records.size(), 512u);
  EXPECT_EQ(records.back().offset + records.back().length + 39, file.size());
  ASSERT_EQ(t.calibration_lines.size(), 1u);
  for (std::size_t l = 0; l < records.size(); ++l) {
    const Record& r = records[l];
    const bool cal = static_cast<int>(l) == t.calibration_lines[0];
    EXPECT_EQ(r.apid, 1556u);
    EXPECT_EQ(r.dfh, 29u);
    EXPECT_EQ(r.mode, 84u);
    EXPECT_EQ(r.counter, static_cast<unsigned>(t.first_counter) + l);
    EXPECT_EQ(r.seq, r.counter & 0x3FFF);
    EXPECT_EQ(r.position, (r.counter - 105) % 1024);
    EXPECT_EQ(r.beam, 2u);
    EXPECT_EQ(r.pri, 11624u);
    EXPECT_EQ(r.swst, static_cast<unsigned>(t.swst_code));
    EXPECT_EQ(r.pulse, 521u);
    EXPECT_EQ(r.bandwidth, 255u);
    EXPECT_NEAR(r.time, t.first_line_time + static_cast<double>(l) / t.prf, 0.6e-6);
    if (cal) {
      EXPECT_EQ(r.position, 1023u);
      EXPECT_EQ(r.flags & 0xB0, 0x30u);
      EXPECT_EQ(r.payload.size(), 4u * 2u * r.swl);
    } else {
      EXPECT_EQ(r.flags & 0x80, 0x80u);
      EXPECT_EQ(r.swl, 1024u);
      EXPECT_EQ(r.payload.size(), sim::fbaq_line_bytes(1024));
    }
  }
  EXPECT_NEAR(t.near_range_time, t.swst_code / 19207680.0 + t.swath_rank / t.prf - 5.099499844618549e-07, 1e-15);
}

TEST(Level0Product, PointTargetEchoLiesWhereTheTruthSaysAndSurvivesQuantisation) {
  sim::SimulationConfig c = small_config("echo");
  c.noise_db = -200.0;  // no noise: the echo alone
  const sim::SimulationTruth t = sim::run_simulation(c);
  const std::vector<Record> records = walk(read_all(t.level0_path));
  const sim::TargetTruth& target = t.targets.front();
  EXPECT_NEAR(target.azimuth_line, 256.0, 0.5);

  // Range: correlating with the transmitted chirp peaks at the leading edge of the echo.
  const std::size_t line = static_cast<std::size_t>(std::lround(target.azimuth_line));
  const std::vector<std::complex<double>> echo = decode_echo(records[line], c.im);
  const double fs = c.im.sampling_frequency, tp = t.pulse_length, rate = t.chirp_bandwidth / tp;
  const int n = static_cast<int>(tp * fs);
  int best_lag = -1;
  double best = 0.0;
  for (int lag = 0; lag + n < static_cast<int>(echo.size()); ++lag) {
    std::complex<double> acc{};
    for (int k = 0; k < n; ++k) {
      const double v = k / fs - tp / 2.0;
      acc += echo[static_cast<std::size_t>(lag + k)] * std::polar(1.0, -sim::kPi * rate * v * v);
    }
    if (std::abs(acc) > best) best = std::abs(acc), best_lag = lag;
  }
  EXPECT_NEAR(best_lag, target.range_sample, 1.0);
  // Compressed amplitude: the target's amplitude times the pulse samples, within the losses of
  // 8-bit and 4-bit quantisation and of sampling the response off its peak.
  // The target lies between samples, which costs up to a third of the peak at whole-sample lags.
  EXPECT_GT(best / n, 0.6 * target.target.amplitude);
  EXPECT_LT(best / n, 1.15 * target.target.amplitude);

  // Azimuth: the phase of the compressed target along the lines is -4 pi R / lambda, a parabola
  // whose vertex is the zero-Doppler line and whose curvature is the Doppler rate.
  double s[5] = {0, 0, 0, 0, 0}, r[3] = {0, 0, 0};  // sums of x^k and of phase x^k
  double previous = 0.0, unwrap = 0.0;
  bool first = true;
  for (std::size_t l = 0; l < records.size(); ++l) {
    if (records[l].flags & 0x20) continue;  // calibration
    const std::vector<std::complex<double>> e = decode_echo(records[l], c.im);
    std::complex<double> acc{};
    for (int k = 0; k < n; ++k) {
      const double v = k / fs - tp / 2.0;
      acc += e[static_cast<std::size_t>(best_lag + k)] * std::polar(1.0, -sim::kPi * rate * v * v);
    }
    const double phase = std::arg(acc);
    if (!first) unwrap += std::remainder(phase - previous, 2.0 * sim::kPi);
    first = false;
    previous = phase;
    const double x = static_cast<double>(l) - 256.0;
    const double p = unwrap;  // unwrapped phase relative to the first line
    double xk = 1.0;
    for (int k = 0; k < 5; ++k, xk *= x) {
      s[k] += xk;
      if (k < 3) r[k] += p * xk;
    }
  }
  // Normal equations of p = a0 + a1 x + a2 x^2, solved by Cramer's rule.
  auto det3 = [](double a, double b, double c, double d, double e, double f, double g, double h, double i) {
    return a * (e * i - f * h) - b * (d * i - f * g) + c * (d * h - e * g);
  };
  const double d = det3(s[0], s[1], s[2], s[1], s[2], s[3], s[2], s[3], s[4]);
  const double a1 = det3(s[0], r[0], s[2], s[1], r[1], s[3], s[2], r[2], s[4]) / d;
  const double a2 = det3(s[0], s[1], r[0], s[1], s[2], r[1], s[2], s[3], r[2]) / d;
  EXPECT_NEAR(256.0 - a1 / (2.0 * a2), target.azimuth_line, 0.5);
  EXPECT_NEAR(a2 * t.prf * t.prf / sim::kPi, target.doppler_rate, 0.01 * std::abs(target.doppler_rate));
}

TEST(Level0Product, FaultsLeaveTheirMarks) {
  const sim::Fault all[] = {sim::Fault::kLostPackets, sim::Fault::kCorruptHeader, sim::Fault::kWrongModeId,
                            sim::Fault::kSequenceWrap, sim::Fault::kSwstChange, sim::Fault::kTruncated};
  for (const sim::Fault fault : all) {
    SCOPED_TRACE(sim::fault_name(fault));
    EXPECT_EQ(sim::fault_from_name(sim::fault_name(fault)), fault);
    sim::SimulationConfig c = small_config(std::string("fault_") + sim::fault_name(fault));
    c.lines = 300;
    c.samples = 256;
    c.faults = {fault};
    const sim::SimulationTruth t = sim::run_simulation(c);
    const std::string file = read_all(t.level0_path);
    const std::vector<Record> records = walk(file);
    std::map<unsigned, const Record*> by_line;
    for (const Record& r : records) by_line[r.counter - static_cast<unsigned>(t.first_counter)] = &r;
    switch (fault) {
      case sim::Fault::kLostPackets:
        ASSERT_EQ(t.lost_lines.size(), 5u);
        EXPECT_EQ(records.size(), 295u);
        for (int l : t.lost_lines) EXPECT_EQ(by_line.count(static_cast<unsigned>(l)), 0u);
        EXPECT_EQ(by_line.count(static_cast<unsigned>(t.lost_lines.back() + 1)), 1u);
        EXPECT_NE(file.find("NUM_MISSING_ISPS=+0000000005"), std::string::npos);
        break;
      case sim::Fault::kCorruptHeader: {
        ASSERT_EQ(records.size(), 300u);
        const Record& r = records[static_cast<std::size_t>(t.corrupt_header_line)];
        EXPECT_NE(r.seq, r.counter & 0x3FFF);
        EXPECT_NE(r.mode, 84u);
        EXPECT_NE(r.apid, 1556u);
        EXPECT_NE(r.dfh, 29u);
        EXPECT_EQ(records[static_cast<std::size_t>(t.corrupt_header_line) + 1].seq,
                  records[static_cast<std::size_t>(t.corrupt_header_line) + 1].counter & 0x3FFF);
        break;
      }
      case sim::Fault::kWrongModeId: {
        int wrong = 0;
        for (const Record& r : records) wrong += r.mode != 84u;
        EXPECT_EQ(wrong, 1);
        EXPECT_EQ(records[static_cast<std::size_t>(t.wrong_mode_line)].mode, 85u);
        break;
      }
      case sim::Fault::kSequenceWrap:
        ASSERT_GT(t.sequence_wrap_line, 0);
        EXPECT_EQ(records[static_cast<std::size_t>(t.sequence_wrap_line)].seq, 0u);
        EXPECT_EQ(records[static_cast<std::size_t>(t.sequence_wrap_line) - 1].seq, 0x3FFFu);
        EXPECT_EQ(records[static_cast<std::size_t>(t.sequence_wrap_line)].counter, 16384u);
        break;
      case sim::Fault::kSwstChange:
        EXPECT_EQ(records[static_cast<std::size_t>(t.swst_change_line) - 1].swst, static_cast<unsigned>(t.swst_code));
        EXPECT_EQ(records[static_cast<std::size_t>(t.swst_change_line)].swst, static_cast<unsigned>(t.swst_code) + 24u);
        EXPECT_EQ(records.back().swst, static_cast<unsigned>(t.swst_code_after_change));
        break;
      case sim::Fault::kTruncated:
        EXPECT_EQ(static_cast<long long>(file.size()), t.truncated_at_byte);
        EXPECT_LT(t.truncated_at_byte, t.full_size);
        ASSERT_FALSE(records.empty());
        EXPECT_EQ(records.back().counter - static_cast<unsigned>(t.first_counter), static_cast<unsigned>(t.last_whole_line));
        break;
      case sim::Fault::kSwappedPolarisation:
        break;  // alternating polarisation only: the AP extraction's tests read its marks
    }
  }
}

TEST(Level0Product, RejectsScenesItCannotWrite) {
  sim::SimulationConfig c = small_config("bad");
  c.targets.clear();
  EXPECT_THROW(sim::run_simulation(c), std::invalid_argument);
  c = small_config("bad");
  c.samples = 9000;  // more than a packet buffer of the extraction holds
  EXPECT_THROW(sim::run_simulation(c), std::invalid_argument);
  c = small_config("bad");
  c.lines = 1;
  EXPECT_THROW(sim::run_simulation(c), std::invalid_argument);
  EXPECT_THROW(sim::fault_from_name("flood"), std::invalid_argument);
}

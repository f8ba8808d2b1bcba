// Level 0 extraction: headers of real products, and the packet walk over small products built
// here byte by byte, one fault per case.
#include <gtest/gtest.h>

#include <array>
#include <cstdint>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <string>
#include <vector>

#include "base/errors.hpp"
#include "envisat/extract.hpp"

namespace fs = std::filesystem;
using namespace sar::envisat;
namespace ec = sar::base::ec;

namespace {

// ---- Test-side builder of minimal level 0 products -------------------------------------------

constexpr int kSamples = 126;  // two whole FBAQ blocks, 128 payload bytes a line
constexpr int kPayload = 128;
constexpr int kFirst = 2000;   // mode packet counter of the first packet
constexpr int kSwst = 1232;
constexpr double kFs = 19207680.0;
constexpr double kPrf = 1652.0;
constexpr int kRank = 9;
constexpr double kGateBias = 1e-6;

struct Packet {
  int counter = 0;
  int seqCount = -1;       // -1: the low 14 bits of the counter
  int processId = 1556;
  int modeId = 84;
  int fieldHeader = 29;
  int beam = 6;
  int flags = 0x80;        // echo
  int swst = kSwst;
  int payloadBytes = kPayload;
  std::uint8_t threshold = 0;  // FBAQ block threshold: the test tables decode I to it
};

void put16(std::vector<std::uint8_t>& b, std::size_t at, int v) {
  b[at] = static_cast<std::uint8_t>(v >> 8);
  b[at + 1] = static_cast<std::uint8_t>(v);
}

std::vector<std::uint8_t> packet_bytes(const Packet& p) {
  std::vector<std::uint8_t> b(68 + static_cast<std::size_t>(p.payloadBytes), 0);
  const std::uint32_t days = 4471, seconds = 25894, micro = static_cast<std::uint32_t>(p.counter % 1000000);
  for (int k = 0; k < 4; ++k) {
    b[static_cast<std::size_t>(k)] = static_cast<std::uint8_t>(days >> (24 - 8 * k));
    b[static_cast<std::size_t>(4 + k)] = static_cast<std::uint8_t>(seconds >> (24 - 8 * k));
    b[static_cast<std::size_t>(8 + k)] = static_cast<std::uint8_t>(micro >> (24 - 8 * k));
  }
  put16(b, 32, 0x0800 | p.processId);
  put16(b, 34, 0xc000 | (p.seqCount >= 0 ? p.seqCount : (p.counter & 0x3fff)));
  put16(b, 36, p.payloadBytes + 29);
  put16(b, 38, p.fieldHeader);
  b[41] = static_cast<std::uint8_t>(p.modeId);
  b[48] = static_cast<std::uint8_t>(p.counter >> 16);
  b[49] = static_cast<std::uint8_t>(p.counter >> 8);
  b[50] = static_cast<std::uint8_t>(p.counter);
  b[51] = static_cast<std::uint8_t>(p.beam << 2);
  b[52] = static_cast<std::uint8_t>(p.flags);
  put16(b, 54, 11628);
  put16(b, 56, p.swst);
  put16(b, 58, kSamples);
  put16(b, 62, 496 << 6);
  b[64] = 255;
  for (int blk = 0; blk * 64 < p.payloadBytes; ++blk) {
    b[68 + static_cast<std::size_t>(blk) * 64] = p.threshold;
    for (int k = 1; k < 64 && blk * 64 + k < p.payloadBytes; ++k) b[68 + static_cast<std::size_t>(blk * 64 + k)] = 0x3c;
  }
  return b;
}

std::string padded(std::string text, std::size_t size) {
  text.resize(size, ' ');
  return text;
}

struct Product {
  std::string name = "ASA_IM__0CNPDE20120329_071134_000000163113_00121_52721_6279.N1";
  std::string sphMode = "IM";
  std::vector<Packet> packets;
  std::vector<std::uint8_t> junkAfter;  // bytes inserted after packet junkAt
  int junkAt = -1;
  std::int64_t cutAt = -1;              // truncate the whole file to this size

  std::vector<std::uint8_t> bytes() const {
    std::string mph = padded("PRODUCT=\"" + name + "\"\n", 1247);
    std::string sph(1956, ' ');
    sph.replace(0, 16, "SPH_DESCRIPTOR=\"");
    sph.replace(16, 4, "ASA_");
    sph.replace(20, sphMode.size(), sphMode);
    sph.replace(56, 11, "+0039729593");
    sph.replace(120, 11, "+0028548148");
    sph.replace(775, 5, "H/H  ");
    sph[791] = '6';
    std::vector<std::uint8_t> out(mph.begin(), mph.end());
    out.insert(out.end(), sph.begin(), sph.end());
    for (std::size_t k = 0; k < packets.size(); ++k) {
      const auto b = packet_bytes(packets[k]);
      out.insert(out.end(), b.begin(), b.end());
      if (static_cast<int>(k) == junkAt) out.insert(out.end(), junkAfter.begin(), junkAfter.end());
    }
    if (cutAt >= 0) out.resize(static_cast<std::size_t>(cutAt));
    return out;
  }
};

Product clean_product(int count, int first = kFirst) {
  Product p;
  for (int k = 0; k < count; ++k) {
    Packet pk;
    pk.counter = first + k;
    pk.threshold = static_cast<std::uint8_t>((first + k) % 256);
    p.packets.push_back(pk);
  }
  return p;
}

LineTable im_table(int count, int first = kFirst) {
  LineTable t;
  t.lines_per_cycle = 1;
  t.cycle_count = count;
  t.first_echo_counter = first;
  t.first_packet_counter = first;
  t.last_packet_counter = first + count - 1;
  t.entries.assign(static_cast<std::size_t>(count), LineTableEntry{});
  return t;
}

// Tables under which a sample decodes to I = block threshold, Q = mapped code row.
FbaqTables test_tables() {
  FbaqTables t;
  for (int r = 0; r < 16; ++r)
    for (int c = 0; c < 256; ++c) {
      t.i.values[static_cast<std::size_t>(r * 256 + c)] = static_cast<float>(c);
      t.q.values[static_cast<std::size_t>(r * 256 + c)] = static_cast<float>(r);
    }
  return t;
}

struct Result {
  int status = 0;
  sarpar par;
  extconf conf;
  std::vector<float> lineTimes;
  std::vector<float> firstI;  // I of sample 0 of each line
};

class ExtractTest : public ::testing::Test {
 protected:
  void SetUp() override {
    dir_ = fs::path(SAR_BINARY_DIR) / "test_extract_tmp" /
           ::testing::UnitTest::GetInstance()->current_test_info()->name();
    fs::remove_all(dir_);
    fs::create_directories(dir_);
  }
  void TearDown() override { fs::remove_all(dir_); }

  std::string write(const Product& p) {
    const auto path = (dir_ / "product.N1").string();
    const auto b = p.bytes();
    std::ofstream(path, std::ios::binary).write(reinterpret_cast<const char*>(b.data()), static_cast<std::streamsize>(b.size()));
    return path;
  }

  sarpar channel() const {
    sarpar s;
    s.samplingRate = kFs;
    s.prf = kPrf;
    s.samples = kSamples;
    s.swath_rank = kRank;
    s.range_gate_bias = kGateBias;
    s.raw_file = (dir_ / "EXTR").string();
    return s;
  }

  Result run(const Product& p, LineTable table, extconf conf = {}) {
    const std::string path = write(p);
    Result r;
    r.conf = std::move(conf);
    const Level0Header h = read_level0_header(path);
    std::vector<sarpar> ch{channel()};
    std::vector<float> gains(kGainTableLength, 1.0f);
    r.status = extract_level0(path, h, table, tables_, gains, ch, r.conf);
    r.par = ch[0];
    table_ = table;
    std::ifstream in(ch[0].raw_file, std::ios::binary);
    std::vector<float> line(1 + 2 * kSamples);
    while (in.read(reinterpret_cast<char*>(line.data()), static_cast<std::streamsize>(line.size() * sizeof(float)))) {
      r.lineTimes.push_back(line[0]);
      r.firstI.push_back(line[1]);
    }
    return r;
  }

  fs::path dir_;
  FbaqTables tables_ = test_tables();
  LineTable table_;
};

float range_time(int swst) { return static_cast<float>(swst / kFs + kRank / kPrf - kGateBias); }

// ---- Clean walk ----------------------------------------------------------------------------

TEST_F(ExtractTest, CleanProductGivesOneLinePerPacketWithTimesAndCounters) {
  const Result r = run(clean_product(20), im_table(20));
  ASSERT_EQ(r.status, 0);
  ASSERT_EQ(r.par.lines, 20);
  ASSERT_EQ(r.firstI.size(), 20u);
  for (int k = 0; k < 20; ++k) {
    EXPECT_EQ(r.firstI[static_cast<std::size_t>(k)], static_cast<float>((kFirst + k) % 256)) << k;
    EXPECT_EQ(r.lineTimes[static_cast<std::size_t>(k)], range_time(kSwst));
    EXPECT_EQ(r.conf.line_counter[0][static_cast<std::size_t>(k)], kFirst + k);
    EXPECT_EQ(r.conf.line_replaced[0][static_cast<std::size_t>(k)], 0);
    EXPECT_EQ(r.conf.line_swst[0][static_cast<std::size_t>(k)], kSwst);
  }
  EXPECT_EQ(r.conf.acquisition_mode, kModeIM);
  EXPECT_EQ(r.par.swath_number, 6);
  EXPECT_EQ(r.par.polarization_type, 0);
  EXPECT_EQ(r.par.swst_change_count, 0);
  EXPECT_DOUBLE_EQ(r.par.nearRangeTime, kSwst / kFs + kRank / kPrf - kGateBias);
  EXPECT_DOUBLE_EQ(r.par.antenna_length, 10.0);
  EXPECT_NEAR(r.par.scene_centre_latitude, (39729593.0 + 28548148.0) * 5e-7, 1e-9);
  // Sensing time of packet kFirst: MJD2000 day 4471 (2000 is day 5478 of sec85), 25894 s, kFirst us.
  EXPECT_NEAR(r.par.azimuthStartTime, (4471.0 + 5478.0) * 86400.0 + 25894.0 + kFirst * 1e-6, 1e-6);
}

// ---- Fault table: what reaches the line grid -------------------------------------------------

struct GapCase {
  const char* name;
  std::vector<int> dropped;         // packet indices missing from the stream
  std::vector<int> expectReplaced;  // lines filled
  std::vector<int> expectI;         // I of sample 0 per line (packet index whose line it holds)
};

TEST_F(ExtractTest, LostPacketsAreFilledAndFlaggedAndLaterLinesKeepTheirPlace) {
  const std::vector<GapCase> cases = {
      {"two lost in the middle", {3, 4}, {3, 4}, {0, 1, 2, 2, 2, 5, 6, 7}},
      {"first packet lost", {0}, {0}, {1, 1, 2, 3, 4, 5, 6, 7}},
      {"last-but-one lost", {6}, {6}, {0, 1, 2, 3, 4, 5, 5, 7}},
  };
  for (const GapCase& c : cases) {
    SCOPED_TRACE(c.name);
    Product p = clean_product(8);
    for (auto it = c.dropped.rbegin(); it != c.dropped.rend(); ++it) p.packets.erase(p.packets.begin() + *it);
    const Result r = run(p, im_table(8));
    ASSERT_EQ(r.par.lines, 8);
    ASSERT_EQ(r.firstI.size(), 8u);
    for (int k = 0; k < 8; ++k) {
      const bool filled = std::find(c.expectReplaced.begin(), c.expectReplaced.end(), k) != c.expectReplaced.end();
      EXPECT_EQ(r.conf.line_replaced[0][static_cast<std::size_t>(k)], filled ? 1 : 0) << k;
      EXPECT_EQ(r.conf.line_counter[0][static_cast<std::size_t>(k)], filled ? 0 : kFirst + k) << k;
      EXPECT_EQ(r.firstI[static_cast<std::size_t>(k)], static_cast<float>((kFirst + c.expectI[static_cast<std::size_t>(k)]) % 256)) << k;
    }
    for (int k : c.dropped) EXPECT_TRUE(table_.entries[static_cast<std::size_t>(k)].kind_word & kLineLost);
  }
}

TEST_F(ExtractTest, HeadFaultsAreScoredByWeight) {
  struct Case {
    const char* name;
    void (*mutate)(Packet&);
    int expectReplaced;  // line 4 filled (synchronisation lost) or used
  };
  const std::vector<Case> cases = {
      {"wrong mode identifier is tolerated", [](Packet& p) { p.modeId = 91; }, 0},
      {"wrong mode and process identifier are tolerated", [](Packet& p) { p.modeId = 91; p.processId = 1563; }, 0},
      {"counter disagreeing with sequence count loses the packet", [](Packet& p) { p.seqCount = 5; }, 1},
      {"beam outside the mode's swaths loses the packet", [](Packet& p) { p.beam = 12; }, 1},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    Product p = clean_product(8);
    c.mutate(p.packets[4]);
    const Result r = run(p, im_table(8));
    ASSERT_EQ(r.par.lines, 8);
    EXPECT_EQ(r.conf.line_replaced[0][4], c.expectReplaced);
    EXPECT_EQ(r.firstI[5], static_cast<float>((kFirst + 5) % 256));
  }
}

TEST_F(ExtractTest, CorruptBytesBetweenPacketsAreCrossedBySynchronisation) {
  Product p = clean_product(10);
  p.junkAt = 2;
  p.junkAfter.assign(301, 0xa5);
  const Result r = run(p, im_table(10));
  ASSERT_EQ(r.par.lines, 10);
  for (int k = 0; k < 10; ++k) {
    EXPECT_EQ(r.conf.line_replaced[0][static_cast<std::size_t>(k)], 0) << k;
    EXPECT_EQ(r.firstI[static_cast<std::size_t>(k)], static_cast<float>((kFirst + k) % 256)) << k;
  }
}

TEST_F(ExtractTest, CorruptFirstHeadStartsTheWalkAtTheFirstCleanHead) {
  Product p = clean_product(6);
  p.packets[0].fieldHeader = 7;
  p.packets[0].seqCount = 1;  // scores 16
  const Result r = run(p, im_table(6));
  ASSERT_EQ(r.par.lines, 6);
  EXPECT_EQ(r.conf.line_replaced[0][0], 1);
  EXPECT_EQ(r.firstI[0], static_cast<float>((kFirst + 1) % 256));
  EXPECT_EQ(r.conf.line_counter[0][1], kFirst + 1);
}

TEST_F(ExtractTest, SequenceCountWrapKeepsEveryPacket) {
  const int first = 16380;  // the 14-bit source sequence count wraps after 16383
  const Result r = run(clean_product(10, first), im_table(10, first));
  ASSERT_EQ(r.par.lines, 10);
  for (int k = 0; k < 10; ++k) {
    EXPECT_EQ(r.conf.line_replaced[0][static_cast<std::size_t>(k)], 0) << k;
    EXPECT_EQ(r.conf.line_counter[0][static_cast<std::size_t>(k)], first + k) << k;
  }
}

TEST_F(ExtractTest, PacketFarAheadIsStreamNoiseNotAGap) {
  Product p = clean_product(8);
  Packet stray;
  stray.counter = kFirst + 4 + 500;
  p.packets.insert(p.packets.begin() + 4, stray);
  const Result r = run(p, im_table(8));
  ASSERT_EQ(r.par.lines, 8);
  for (int k = 0; k < 8; ++k) EXPECT_EQ(r.conf.line_replaced[0][static_cast<std::size_t>(k)], 0) << k;
}

TEST_F(ExtractTest, SwstChangesAreTrackedAndLeapsAreRefused) {
  struct Case {
    const char* name;
    int newSwst;
    int expectSwstAfter;
  };
  for (const Case& c : {Case{"small change takes effect", kSwst + 40, kSwst + 40},
                        Case{"leap above 100 counts but does not take effect", kSwst + 300, kSwst}}) {
    SCOPED_TRACE(c.name);
    Product p = clean_product(10);
    for (int k = 6; k < 10; ++k) p.packets[static_cast<std::size_t>(k)].swst = c.newSwst;
    const Result r = run(p, im_table(10));
    ASSERT_EQ(r.par.lines, 10);
    EXPECT_EQ(r.par.swst_change_count, 4 * (c.newSwst != c.expectSwstAfter) + (c.newSwst == c.expectSwstAfter));
    EXPECT_EQ(r.conf.line_swst[0][5], kSwst);
    EXPECT_EQ(r.conf.line_swst[0][6], c.expectSwstAfter);
    EXPECT_EQ(r.lineTimes[9], range_time(c.expectSwstAfter));
    EXPECT_EQ(r.par.swst_code, kSwst);
    EXPECT_EQ(r.par.swst_max_code, c.expectSwstAfter);
    EXPECT_DOUBLE_EQ(r.par.far_range_time, c.expectSwstAfter / kFs + kRank / kPrf - kGateBias);
  }
}

TEST_F(ExtractTest, CalibrationPulseKeepsTheLineGrid) {
  Product p = clean_product(6);
  p.packets[3].flags = 0x30;
  LineTable t = im_table(6);
  t.entries[3].kind_word = kLinePeriodicCalibration;
  const Result r = run(p, t);
  ASSERT_EQ(r.par.lines, 6);
  EXPECT_EQ(r.conf.line_replaced[0][3], 1);
  EXPECT_EQ(r.conf.line_counter[0][3], 0);
  EXPECT_EQ(r.firstI[3], r.firstI[2]);
}

TEST_F(ExtractTest, PercentagesSelectAShareOfTheTable) {
  struct Case {
    int skip, extract;
    int expectLines, expectFirstCounter, expectExtractBack;
  };
  for (const Case& c : {Case{50, 0, 10, kFirst + 10, 50}, Case{-5, 30, 6, kFirst, 30}, Case{80, 60, 4, kFirst + 16, 20}}) {
    SCOPED_TRACE(c.skip);
    extconf conf;
    conf.skip_percent = c.skip;
    conf.extract_percent = c.extract;
    const Result r = run(clean_product(20), im_table(20), conf);
    ASSERT_EQ(r.par.lines, c.expectLines);
    EXPECT_EQ(r.conf.line_counter[0][0], c.expectFirstCounter);
    EXPECT_EQ(r.conf.extract_percent, c.expectExtractBack);
    EXPECT_GE(r.conf.skip_percent, 0);
  }
  extconf bad;
  bad.skip_percent = 101;
  EXPECT_EQ(run(clean_product(4), im_table(4), bad).status, 1);
}

// ---- Bad products: the error code with the file name, and no line file left ------------------

TEST_F(ExtractTest, BadProductsFailWithTheirCodeAndLeaveNoLineFile) {
  struct Case {
    const char* name;
    Product product;
    int expectEc;
  };
  Product truncated = clean_product(10);
  truncated.cutAt = 3203 + 6 * (68 + kPayload) + 100;
  Product wrongType = clean_product(4);
  wrongType.name = "ASA_IMS_1PNESA20040703_205338_000000182028_00172_12250_0000.N1";
  Product wrongLetters = clean_product(4);
  wrongLetters.sphMode = "WS";
  Product headersOnly;
  Product empty;
  empty.cutAt = 0;
  const std::vector<Case> cases = {
      {"truncated inside a payload", truncated, ec::kFileIo},
      {"product of another type", wrongType, ec::kBadArguments},
      {"SPH mode disagreeing with the product", wrongLetters, ec::kBadArguments},
      {"headers and no packet", headersOnly, ec::kFileIo},
      {"empty file", empty, ec::kFileIo},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    try {
      run(c.product, im_table(10));
      ADD_FAILURE() << "no error raised";
    } catch (const sar::base::CErrorExceptionManager& e) {
      EXPECT_EQ(e.ec(), c.expectEc);
      ASSERT_FALSE(e.details().empty());
      EXPECT_EQ(e.details()[0], (dir_ / "product.N1").string());
    }
    EXPECT_FALSE(fs::exists(dir_ / "EXTR"));
  }
  try {
    read_level0_header((dir_ / "absent.N1").string());
    ADD_FAILURE() << "no error raised";
  } catch (const sar::base::CErrorExceptionManager& e) {
    EXPECT_EQ(e.ec(), ec::kImageMissing);
  }
}

TEST_F(ExtractTest, RandomlyCorruptedProductsEndInLinesOrAnErrorNeverACrash) {
  const Product base = clean_product(12);
  const std::vector<std::uint8_t> good = base.bytes();
  std::uint32_t seed = 12345;
  auto next = [&seed] { return seed = seed * 1664525u + 1013904223u; };
  for (int round = 0; round < 60; ++round) {
    std::vector<std::uint8_t> b = good;
    const std::size_t packets = b.size() - 3203;
    for (int k = 0; k < 1 + round % 8; ++k) b[3203 + next() % packets] = static_cast<std::uint8_t>(next());
    if (round % 5 == 4) b.resize(3203 + next() % packets);
    const auto path = (dir_ / "product.N1").string();
    std::ofstream(path, std::ios::binary).write(reinterpret_cast<const char*>(b.data()), static_cast<std::streamsize>(b.size()));
    std::vector<sarpar> ch{channel()};
    std::vector<float> gains(kGainTableLength, 1.0f);
    LineTable t = im_table(12);
    extconf conf;
    try {
      const int st = extract_level0(path, read_level0_header(path), t, tables_, gains, ch, conf);
      EXPECT_EQ(st, 0);
      EXPECT_LE(ch[0].lines, 12) << round;
      EXPECT_EQ(fs::file_size(ch[0].raw_file), static_cast<std::uintmax_t>(ch[0].lines) * (4 + 8 * kSamples));
    } catch (const sar::base::CErrorExceptionManager& e) {
      EXPECT_EQ(e.ec(), ec::kFileIo) << round;
      EXPECT_FALSE(fs::exists(dir_ / "EXTR"));
    }
  }
}

// ---- Real truncated IM products --------------------------------------------------------------

const std::string kRealDir = std::string(SAR_REAL_DATA_DIR) + "/ASA_IM__0P_truncated/";

TEST(RealLevel0, HeadersAndFirstPacketHeadDecodeToTheBytes) {
  struct Case {
    const char* file;
    std::uint32_t days, seconds, micro;
    int seq, counter, cyclePos, calRow;
    double startLat, stopLat;
  };
  // Bytes from 3203 (xxd): 20120329 "0000 1177 0000 6526 0006 9ada ... 8e14 c1aa 1a87 001d 0054 ... 0041 aa19 9141
  // 2b14 04d0 1a00 9682 7c20 ff82": days 0x1177, s 0x6526, us 0x69ada; process id (0x8e & 7) << 8 | 0x14 = 1556;
  // sequence count (0xc1 & 63) << 8 | 0xaa = 426 = counter 0x0041aa & 0x3fff; L 0x1a87 = 6791; field header 29;
  // mode id 0x54 = 84; beam 0x19 >> 2 = 6; flags 0x91: echo, cycle position 0x141 = 321; PRI 0x2b14; SWST 0x4d0;
  // SWL 0x1a00; byte 61 0x82: H/H, row 2; pulse code 0x7c << 2 = 496; bandwidth 255.
  // 20111031: "0000 10e1 0000 6503 0007 8bb0 ... 8e14 fa1b 1a87 001d 0054 ... 003a 1b19 91b2 ... 9699": counter
  // 0x3a1b = 14875, sequence (0xfa & 63) << 8 | 0x1b = 14875, cycle position 0x1b2 = 434, row 0x99 & 31 = 25.
  const std::vector<Case> cases = {
      {"ASA_IM__0CNPDE20120329_071134_000000163113_00121_52721_6279.N1", 0x1177, 0x6526, 0x69ada, 426, 0x41aa, 321, 2,
       39729593, 28548148},
      {"ASA_IM__0CNPDE20111031_071059_000000163108_00121_50566_4642.N1", 0x10e1, 0x6503, 0x78bb0, 14875, 0x3a1b, 434,
       25, 39574766, 33247303},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.file);
    const std::string path = kRealDir + c.file;
    const Level0Header h = read_level0_header(path);
    EXPECT_EQ(h.productType, 8);
    EXPECT_EQ(h.mode, kModeIM);
    EXPECT_EQ(h.channels, 1);
    EXPECT_EQ(h.polarizationType, 0);
    EXPECT_EQ(h.swathDigit, 6);
    EXPECT_NEAR(h.sceneCentreLatitude, (c.startLat + c.stopLat) * 5e-7, 1e-9);

    std::array<std::uint8_t, 68> head{};
    std::ifstream in(path, std::ios::binary);
    in.seekg(3203);
    ASSERT_TRUE(in.read(reinterpret_cast<char*>(head.data()), 68));
    EXPECT_EQ(check_packet_header(head, kModeIM), 0);
    const PacketHead p = decode_packet_head(head);
    EXPECT_EQ(p.days, c.days);
    EXPECT_EQ(p.seconds, c.seconds);
    EXPECT_EQ(p.microseconds, c.micro);
    EXPECT_EQ(p.processId, 1556);
    EXPECT_EQ(p.sequenceCount, c.seq);
    EXPECT_EQ(p.modeCounter, c.counter);
    EXPECT_EQ(p.packetLength, 6791);
    EXPECT_EQ(p.payload_bytes(), 6762);
    EXPECT_EQ(p.fieldHeaderLength, 29);
    EXPECT_EQ(p.modeId, 84);
    EXPECT_EQ(p.beamCode, 6);
    EXPECT_TRUE(p.echo);
    EXPECT_FALSE(p.noise);
    EXPECT_FALSE(p.calibration);
    EXPECT_EQ(p.cyclePosition, c.cyclePos);
    EXPECT_EQ(p.priCode, 0x2b14);
    EXPECT_EQ(p.swstCode, 0x4d0);
    EXPECT_EQ(p.swlCode, 0x1a00);
    EXPECT_FALSE(p.txV);
    EXPECT_FALSE(p.rxV);
    EXPECT_EQ(p.calibrationRow, c.calRow);
    EXPECT_EQ(p.pulseLengthCode, 496);
    EXPECT_EQ(p.chirpBandwidthCode, 255);
    EXPECT_EQ(check_packet_header(head, kModeWS), 4 + 4 + 12);  // process id, mode id, beam 6 - 15
  }
}

TEST(RealLevel0, ExtractionStopsWhereTheProductEnds) {
  const fs::path out = fs::path(SAR_BINARY_DIR) / "test_extract_real_EXTR";
  for (const char* file : {"ASA_IM__0CNPDE20120329_071134_000000163113_00121_52721_6279.N1",
                           "ASA_IM__0CNPDE20111031_071059_000000163108_00121_50566_4642.N1"}) {
    SCOPED_TRACE(file);
    const std::string path = kRealDir + file;
    const Level0Header h = read_level0_header(path);
    std::array<std::uint8_t, 68> head{};
    std::ifstream in(path, std::ios::binary);
    in.seekg(3203);
    in.read(reinterpret_cast<char*>(head.data()), 68);
    const int first = decode_packet_head(head).modeCounter;
    LineTable t = im_table(1000, first);
    sarpar s;
    s.samplingRate = kFs;
    s.prf = kFs / 0x2b14;
    s.samples = 0x1a00;
    s.swath_rank = kRank;
    s.raw_file = out.string();
    std::vector<sarpar> ch{s};
    std::vector<float> gains(kGainTableLength, 1.0f);
    extconf conf;
    try {
      extract_level0(path, h, t, test_tables(), gains, ch, conf);
      ADD_FAILURE() << "no error raised";
    } catch (const sar::base::CErrorExceptionManager& e) {
      EXPECT_EQ(e.ec(), ec::kFileIo);
      ASSERT_GE(e.details().size(), 2u);
      EXPECT_EQ(e.details()[0], path);
      EXPECT_NE(e.details()[1].find("truncated"), std::string::npos) << e.details()[1];
    }
    EXPECT_FALSE(fs::exists(out));
  }
}

}  // namespace

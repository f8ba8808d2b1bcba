#include <gtest/gtest.h>

#include <bit>
#include <cmath>
#include <cstdint>
#include <filesystem>
#include <fstream>
#include <functional>
#include <string>
#include <unistd.h>

#include "base/errors.hpp"
#include "envisat/aux_products.hpp"

namespace fs = std::filesystem;
using namespace sar::envisat;
namespace ec = sar::base::ec;

namespace {

const fs::path kReal = SAR_REAL_DATA_DIR;
const std::string kInsA = (kReal / "ASA_INS_AX/ASA_INS_AXVIEC20020308_112323_20020301_000000_20021231_000000").string();
const std::string kInsB = (kReal / "ASA_INS_AX/ASA_INS_AXVIEC20070227_105626_20070228_060000_20071231_000000").string();
const std::string kInsC = (kReal / "ASA_INS_AX/ASA_INS_AXVIEC20101222_143805_20101022_000000_20141231_235959").string();
const std::string kXcaA = (kReal / "ASA_XCA_AX/ASA_XCA_AXVIEC20020308_112533_20020301_000000_20021231_000000").string();
const std::string kXcaB = (kReal / "ASA_XCA_AX/ASA_XCA_AXVIEC20060717_154125_20050916_195733_20061231_000000").string();
const std::string kXch = (kReal / "ASA_XCH_AX/ASA_XCH_AXVIEC20101222_143057_20020301_000000_20141231_000000").string();
const std::string kCon = (kReal / "ASA_CON_AX/ASA_CON_AXVIEC20030703_000000_20020301_000000_20020815_000000").string();

// A big-endian word as xxd shows it, read back as the float it encodes.
float be(std::uint32_t word) { return std::bit_cast<float>(word); }

std::vector<std::string> files_in(const char* folder) {
  std::vector<std::string> out;
  for (const auto& e : fs::directory_iterator(kReal / folder)) out.push_back(e.path().string());
  return out;
}

// Scratch folder removed at the end of the test.
struct ScratchDir {
  fs::path dir = fs::temp_directory_path() /
                 ("sar_aux_" + std::to_string(::getpid()) + "_" +
                  ::testing::UnitTest::GetInstance()->current_test_info()->name());
  ScratchDir() { fs::create_directories(dir); }
  ~ScratchDir() { fs::remove_all(dir); }
};

std::string slurp(const std::string& path) {
  std::ifstream in(path, std::ios::binary);
  return {std::istreambuf_iterator<char>(in), std::istreambuf_iterator<char>()};
}

int error_code_of(const std::function<void()>& f, std::vector<std::string>* details = nullptr) {
  try {
    f();
  } catch (const sar::base::CErrorExceptionManager& e) {
    if (details) *details = e.details();
    return e.ec();
  }
  return 0;
}

}  // namespace

TEST(AuxProducts, EveryRealAuxiliaryFileIsRead) {
  const auto insFiles = files_in("ASA_INS_AX");
  const auto xcaFiles = files_in("ASA_XCA_AX");
  const auto xchFiles = files_in("ASA_XCH_AX");
  ASSERT_EQ(insFiles.size(), 13u);
  ASSERT_EQ(xcaFiles.size(), 55u);
  ASSERT_EQ(xchFiles.size(), 1u);
  for (const auto& path : insFiles) {
    const InsRecord ins = InsRecord::read(path);
    EXPECT_EQ(ins.header().dsOffset, 1625) << path;
    EXPECT_LT(ins.validity_start(), ins.validity_stop()) << path;
    // ASAR is a C-band radar sampled at 19.208 MHz.
    EXPECT_NEAR(ins.carrier_frequency(), 5.331e9, 1e6) << path;
    EXPECT_NEAR(ins.sampling_frequency(), 19.20768e6, 1.0) << path;
    // Codes 0-7 and 8-15 are sign and magnitude, so mapped rows r and 15 - r reconstruct to
    // nearly opposite levels (within 0.01 of the 8-bit sample scale).
    const FbaqLut lutI = ins.lut_i();
    const FbaqLut lutQ = ins.lut_q();
    for (int c = 0; c < 256; ++c)
      for (int r = 0; r < 8; ++r) {
        ASSERT_NEAR(lutI(r, c), -lutI(15 - r, c), 0.01) << path << " row " << r << " col " << c;
        ASSERT_NEAR(lutQ(r, c), -lutQ(15 - r, c), 0.01) << path << " row " << r << " col " << c;
      }
    for (int beam = 1; beam <= 7; ++beam) {
      EXPECT_EQ(ins.burst_echoes(Timeline::kIm, beam), 1023) << path;
      EXPECT_GE(ins.swath_rank(Timeline::kIm, beam), 9) << path;
      EXPECT_LE(ins.swath_rank(Timeline::kIm, beam), 14) << path;
    }
  }
  for (const auto& path : xcaFiles) {
    const XcaRecord xca = XcaRecord::read(path);
    EXPECT_LT(xca.validity_start(), xca.validity_stop()) << path;
    for (int beam = 1; beam <= 7; ++beam) {
      // Elevation gains in dB, within a few dB of 0 at the peak, falling
      // off by more than 3 dB at both ends of the 10-degree span.
      const auto g = xca.elevation_gains(beam, 0);
      float peak = -1e9f;
      for (float v : g) {
        ASSERT_TRUE(std::isfinite(v)) << path;
        peak = std::max(peak, v);
      }
      EXPECT_NEAR(peak, 0.0f, 5.0f) << path << " beam " << beam;
      EXPECT_LT(g.front(), peak - 3.0f) << path << " beam " << beam;
      EXPECT_LT(g.back(), peak - 3.0f) << path << " beam " << beam;
    }
  }
  const XchRecord xch = XchRecord::read(xchFiles.front());
  EXPECT_EQ(xch.header().dsrSize, 596);
}

TEST(AuxProducts, InsFieldsEqualTheBytesDecodedByHand) {
  // Each expected word is the xxd output at file byte 1625 + record offset of the field.
  struct Case {
    const std::string* path;
    std::uint32_t rangeGateBias;  // record 69912
    int apBlockEchoes5;           // record 161662 + 10
    int wsBurstEchoes16;          // record 161690 + 32
    float gainT;                  // record 171368
    std::uint32_t row3Pol1Re;     // record 162016 + 3 * 512 + 256
    std::uint32_t row3Pol1Im;
    std::uint32_t wsRow0Re5;      // record 165600 + 5 * 8
    std::uint32_t wsRow0Im5;
  };
  const Case cases[] = {
      {&kInsA, 0x34aff59e, 0x0115, 0x004f, be(0x42340000), 0xbf0c6f48, 0xbf2a0c17, 0x3f5d3d53, 0x3e623d4f},
      {&kInsB, 0x3508e37f, 0x00c2, 0x0041, be(0x40a00000), 0xbf36e0c1, 0xbf098cd2, 0x3f6b12c2, 0xbd3980f5},
      {&kInsC, 0x3508e37f, 0x011b, 0x0042, be(0x40a00000), 0xbf36e0c1, 0xbf098cd2, 0x3f6b12c2, 0xbd3980f5},
  };
  for (const Case& c : cases) {
    const InsRecord ins = InsRecord::read(*c.path);
    SCOPED_TRACE(*c.path);
    EXPECT_EQ(ins.carrier_frequency(), be(0x4f9ee056));   // record 16: 5.331004416e9 Hz
    EXPECT_EQ(ins.sampling_frequency(), be(0x4b928b00));  // record 20: 19207680 Hz
    EXPECT_EQ(ins.range_gate_bias(), be(c.rangeGateBias));
    EXPECT_EQ(ins.swath_rank(Timeline::kIm, 7), 0x000e);      // record 161620 + 14
    EXPECT_EQ(ins.swath_rank(Timeline::kWs, 19), 0x000b);     // record 161704 + 38
    EXPECT_EQ(ins.burst_echoes(Timeline::kAp, 5), c.apBlockEchoes5);
    EXPECT_EQ(ins.burst_echoes(Timeline::kWs, 16), c.wsBurstEchoes16);
    EXPECT_EQ(ins.pattern_reference_angle(1), be(0x41850625));  // record 161920: 16.628 deg
    EXPECT_EQ(ins.pattern_reference_angle(7), be(0x42183b64));  // record 161944: 38.058 deg
    EXPECT_EQ(ins.gain_temperature(), c.gainT);
    EXPECT_EQ(ins.gain_coefficients()[2], 25.0);  // record 171388: 40 39 00 00 00 00 00 00
    EXPECT_EQ(ins.lut_i()(15, 100), be(0x3f99e5f3));   // record 74656 + 4 (256 * 15 + 100)
    EXPECT_EQ(ins.lut_i()(8, 0), be(0x3ae874c9));      // record 74656 + 4 * 2048
    EXPECT_EQ(ins.lut_q()(0, 255), be(0xc31793b6));    // record 103328 + 4 * 255: -151.577
    const ComplexRow row = ins.row_coefficients(3, 1);
    EXPECT_EQ(row[0], std::complex<float>(be(c.row3Pol1Re), be(c.row3Pol1Im)));
    const ComplexRow wsRow = ins.ws_row_coefficients(0, 0);
    EXPECT_EQ(wsRow[5], std::complex<float>(be(c.wsRow0Re5), be(c.wsRow0Im5)));
    const InsParameters p = ins.parameters(Timeline::kWs, 16);
    EXPECT_EQ(p.burstEchoes, c.wsBurstEchoes16);
    EXPECT_EQ(p.swathRank, ins.swath_rank(Timeline::kWs, 16));
  }
}

TEST(AuxProducts, XcaAndXchFieldsEqualTheBytesDecodedByHand) {
  // Elevation gain k of beam b, polarisation p at record byte 4 (201 (4 b + p) + k) - 2424,
  // file byte 1625 more: (1, 0, 0) at 2417, (2, 1, 100) at 6837, (7, 3, 200) at 24925.
  const XcaRecord a = XcaRecord::read(kXcaA);
  EXPECT_EQ(a.elevation_gains(1, 0)[0], be(0xc19b22ed));  // -19.39 dB
  EXPECT_EQ(a.elevation_gains(2, 1)[100], 0.0f);          // the pattern's peak
  EXPECT_EQ(a.elevation_gains(7, 3)[200], be(0xc2153be4));
  const XcaRecord b = XcaRecord::read(kXcaB);
  EXPECT_EQ(b.elevation_gains(1, 0)[0], be(0xc1955cfb));
  EXPECT_EQ(b.elevation_gains(7, 3)[200], be(0xc2119c43));
  EXPECT_EQ(b.header().validityStart, "16-SEP-2005 19:57:33.000000");  // MPH byte 351
  EXPECT_EQ(b.header().validityStop, "31-DEC-2006 00:00:00.000000");   // MPH byte 394
  EXPECT_THROW((void)a.elevation_gains(0, 0), std::out_of_range);      // before the record
  // Slot 8 (wide swath SS1) is the last table the record holds: its polarisation 3 ends 32
  // bytes before the record does.
  EXPECT_NO_THROW((void)a.elevation_gains(8, 3));
  EXPECT_THROW((void)a.elevation_gains(9, 0), std::out_of_range);      // past its end

  // Loop factors at record 16 + 256 pol: file bytes 1641 (pol 0, k 0) and 2145 (pol 1, k 31).
  const XchRecord x = XchRecord::read(kXch);
  EXPECT_EQ(x.loop_factors(0)[0], std::complex<float>(be(0x3cd9f022), be(0xb80bab9a)));
  EXPECT_EQ(x.loop_factors(1)[31], std::complex<float>(be(0x3cff817a), be(0x3af4be50)));
  EXPECT_THROW((void)x.loop_factors(2), std::out_of_range);

  std::array<ComplexRow, 5> wsRows{};
  ComplexRow g{};
  ASSERT_EQ(read_rows_ws(kInsA, kXch, wsRows, g, 0), 0);
  const InsRecord ins = InsRecord::read(kInsA);
  for (int s = 0; s < 5; ++s)
    EXPECT_EQ(wsRows[static_cast<std::size_t>(s)][7], ins.ws_row_coefficients(s, 0)[7] * g[7]);
  std::array<ComplexRow, 7> rows{};
  ASSERT_EQ(read_rows(kInsA, kXch, rows, g, 1), 0);
  EXPECT_EQ(rows[3][0], ins.row_coefficients(3, 1)[0]);
  EXPECT_EQ(g, x.loop_factors(1));
}

// Broken copies of real products: each mutation must end in its code, never a crash.
TEST(AuxProducts, BrokenFilesFailWithTheirCode) {
  ScratchDir scratch;
  const std::string ins = slurp(kInsA);
  struct Case {
    const char* name;
    std::function<std::string()> bytes;  // file content; empty optional means "no file"
    int reader;                          // 0 INS, 1 XCA, 2 XCH
    int expected;
    const char* field;                   // expected in the details
  };
  auto patched = [&](std::size_t pos, const std::string& text) {
    std::string b = ins;
    b.replace(pos, text.size(), text);
    return b;
  };
  const Case cases[] = {
      {"truncated record", [&] { return ins.substr(0, 100000); }, 0, ec::kFileIo, "MPH TOT_SIZE"},
      {"truncated headers", [&] { return ins.substr(0, 1300); }, 0, ec::kFileIo, "MPH/SPH"},
      {"empty file", [] { return std::string(); }, 0, ec::kFileIo, "MPH/SPH"},
      {"truncated with TOT_SIZE fixed",
       [&] { std::string b = patched(1075, "+00000000000000100000"); return b.substr(0, 100000); }, 0, ec::kFileIo,
       "SPH DS_OFFSET"},
      {"processor configuration as ASA_INS", [&] { return slurp(kCon); }, 0, ec::kBadArguments, "ASA_INS"},
      {"calibration product as ASA_INS", [&] { return slurp(kXcaA); }, 0, ec::kBadArguments, "ASA_INS"},
      {"instrument product as ASA_XCA", [&] { return ins; }, 1, ec::kBadArguments, "ASA_XCA"},
      {"instrument product as ASA_XCH", [&] { return ins; }, 2, ec::kBadArguments, "ASA_XCH"},
      {"DS_OFFSET past the end", [&] { return patched(1247 + 231, "+00000000000000009999"); }, 0, ec::kFileIo,
       "SPH DS_OFFSET"},
      {"DS_OFFSET inside the headers", [&] { return patched(1247 + 231, "+00000000000000000100"); }, 0,
       ec::kFileIo, "SPH DS_OFFSET"},
      {"DS_OFFSET not a number", [&] { return patched(1247 + 231, "+0000000000000000x625"); }, 0, ec::kFileIo,
       "SPH DS_OFFSET"},
      {"DS_OFFSET negative", [&] { return patched(1247 + 231, "-00000000000000001625"); }, 0, ec::kFileIo,
       "SPH DS_OFFSET"},
      {"DS_SIZE too small", [&] { return patched(1247 + 268, "+00000000000000171647"); }, 0, ec::kFileIo,
       "SPH DS_SIZE"},
      {"DS_SIZE overflowing", [&] { return patched(1247 + 268, "+99999999999999999999"); }, 0, ec::kFileIo,
       "SPH DS_SIZE"},
      {"NUM_DSR zero", [&] { return patched(1247 + 305, "+0000000000"); }, 0, ec::kFileIo, "SPH DS_SIZE"},
      {"DSR_SIZE wrong", [&] { return patched(1247 + 326, "+0000026552"); }, 0, ec::kFileIo, "SPH DSR_SIZE"},
      {"XCA moved off its fixed position",
       [&] {
         std::string b = slurp(kXcaA);
         b.replace(1247 + 231, 21, "+00000000000000001624");
         return b;
       },
       1, ec::kFileIo, "SPH DS_OFFSET"},
      {"XCH truncated", [&] { return slurp(kXch).substr(0, 2000); }, 2, ec::kFileIo, "MPH TOT_SIZE"},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    const std::string path = (scratch.dir / "product").string();
    std::ofstream(path, std::ios::binary | std::ios::trunc) << c.bytes();
    std::vector<std::string> details;
    const int code = error_code_of(
        [&] {
          if (c.reader == 0) (void)InsRecord::read(path);
          if (c.reader == 1) (void)XcaRecord::read(path);
          if (c.reader == 2) (void)XchRecord::read(path);
        },
        &details);
    EXPECT_EQ(code, c.expected);
    std::string all;
    for (const auto& d : details) all += d + " | ";
    EXPECT_NE(all.find(path), std::string::npos) << all;
    EXPECT_NE(all.find(c.field), std::string::npos) << all;
  }
}

TEST(AuxProducts, MissingFilesRaiseTheProductsOwnCode) {
  const std::string none = (fs::temp_directory_path() / "sar_no_such_aux_product").string();
  EXPECT_EQ(error_code_of([&] { (void)InsRecord::read(none); }), ec::kInsMissing);
  EXPECT_EQ(error_code_of([&] { (void)XcaRecord::read(none); }), ec::kXcaMissing);
  EXPECT_EQ(error_code_of([&] { (void)XchRecord::read(none); }), ec::kXchMissing);
  FbaqLut q, i;
  EXPECT_EQ(error_code_of([&] { (void)LUTfbaq_f(none, q, i); }), ec::kInsMissing);
}

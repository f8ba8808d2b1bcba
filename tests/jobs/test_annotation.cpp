// The stripmap product annotation: every key of the profile annotation with its value, the
// description converted from it, the raster header, and the small computations behind them.
#include <unistd.h>

#include <cmath>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <sstream>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "base/convert.hpp"
#include "base/profile.hpp"
#include "io/data_file.hpp"
#include "io/description.hpp"
#include "jobs/annotation.hpp"
#include "metadata/ombrixxml.hpp"

namespace fs = std::filesystem;
using namespace sar::jobs;

namespace {

constexpr double kT0 = 854000000.0;  // sec85, early 2012
constexpr double kHalfC = 149896229.0;

std::string text_of(double sec85) {
  std::string t;
  EXPECT_EQ(sar::base::sec852myascii(sec85, t), 0);
  return t;
}

std::string g15(double v) {
  char t[64];
  std::snprintf(t, sizeof t, "%.15g", v);
  return t;
}

/// A focused IM scene of 29000 x 4900 out of 30000 x 5200 raw, descending, over the
/// antimeridian in the south, swath 7, V/V.
struct Scene {
  sarpar par;
  procparm proc;
  dcestconf dc;
  azimuthconf az;
  extconf extra;
  enviauxfiles files;

  Scene() {
    par.prf = 1652.4156;
    par.samplingRate = 19.20768e6;
    par.carrierFrequency = 5.331004e9;
    par.chirp_bandwidth = 16.0e6;
    par.pulse_length = 27.1e-6;
    par.polarization_type = 1;
    par.swath_number = 7;
    par.lines = 30000;
    par.samples = 5200;
    par.nearRangeTime = 5.5e-3;
    par.azimuthStartTime = kT0;

    az.AzimuthOverlap = 500;
    az.RangeOverlap = 150;
    az.azimuthShift = 0.0;

    proc.focusedLines = 29000;
    proc.focusedSamples = 4900;
    proc.firstLineTime = kT0 + 500 / par.prf;
    proc.firstSampleTime = par.nearRangeTime + 150 / par.samplingRate;
    proc.rangePixelSpacing = kHalfC / par.samplingRate;
    proc.azimuthPixelSpacing = 6700.0 / par.prf;
    proc.equivalentVelocity = 6700.0;
    proc.centreIncidence = 20.0;
    proc.centreLook = 17.5;
    proc.patternCentre = 19.8;
    proc.pattern = {1.0f, 0.5f, 0.0f};
    proc.patternLength = 3;
    const double lat[5] = {-33.0, -33.1, -33.9, -34.0, -33.5};
    const double lon[5] = {179.5, 180.4, 179.4, 180.3, 180.0};
    for (size_t k = 0; k < 5; ++k) proc.corners[k] = {0.0, 0.0, lat[k], lon[k]};
    proc.orbitSpacing = 6.05;
    proc.orbitStartTime = kT0 - 3.0;
    for (int k = 0; k < 5; ++k) {
      for (int a = 0; a < 3; ++a) {
        proc.orbitPositions[static_cast<size_t>(3 * k + a)] = 7.0e6 * (a + 1) + 1000.0 * k;
        proc.orbitVelocities[static_cast<size_t>(3 * k + a)] = a == 2 ? -7000.0 + 10.0 * k : 100.0 * (a + 1);
      }
    }
    proc.dopplerCentroid = {50.0, 1.0e5, 2.0, 300.0, 1.0e8, 0, 0, 5.6e-3, kT0 + 9.0};
    proc.outputCentroid = proc.dopplerCentroid;
    proc.dopplerRate = {-2100.0, 1.5e5, 0, 0, 4.0e8, 0, 0, par.nearRangeTime, 0.0};
    proc.outputRate = proc.dopplerRate;
  }
};

class AnnotationTest : public ::testing::Test {
 protected:
  void SetUp() override {
    dir_ = fs::temp_directory_path() / ("sar_annotation_" + std::to_string(::getpid()) + "_" +
                                        ::testing::UnitTest::GetInstance()->current_test_info()->name());
    fs::remove_all(dir_);
    fs::create_directories(dir_);
    slc_ = (dir_ / "scene_slc").string();
    header_ = slc_ + "_hdr";
  }
  void TearDown() override {
    sar::base::FreeProfile();
    fs::remove_all(dir_);
  }
  int run(const Scene& s) { return IMwritepars(header_, s.par, s.proc, s.dc, s.az, s.extra, s.files); }
  /// The value text of a key as a fresh reading of the file gives it.
  std::string raw(const char* section, const char* key) {
    sar::base::FreeProfile(header_);
    const std::string* v = sar::base::GetSetProfileChar(0, section, key, {}, header_);
    return v ? *v : std::string("<absent>");
  }
  fs::path dir_;
  std::string slc_;
  std::string header_;
};

TEST_F(AnnotationTest, EveryKeyIsWrittenWithItsFormAndValue) {
  const Scene s;
  ASSERT_EQ(run(s), 0);
  const double fs = s.par.samplingRate;
  const double prf = s.par.prf;
  const double t1 = s.proc.firstSampleTime;
  const std::string first = text_of(s.proc.firstLineTime);
  const double dt = s.proc.firstLineTime - (kT0 + 9.0);
  const auto& p = s.proc;

  struct Key {
    const char* section;
    const char* key;
    std::string value;
  };
  const std::string q = "\"";
  const std::vector<Key> keys = {
      {"OrbitCorrection", "AzimuthPixelShift", "{0}"},
      {"StateVectorData", "StateVectorSource", q + "SLC_DATA_PRODUCT" + q},
      {"StateVectorData", "StateVectorReference", q + "ECR" + q},
      {"StateVectorData", "nStateVectors", "5"},
      {"StateVectorData", "TimeFirst", q + text_of(kT0 - 3.0) + q},
      {"StateVectorData", "TimeDelta", "6.05"},
      {"InitialGeometry", "Projection", q + "SLANT_RANGE" + q},
      {"InitialGeometry", "SceneHeading", "195"},
      {"InitialGeometry", "TimeDirectionPixel", q + "INCREASE TIME DIRECTION" + q},
      {"InitialGeometry", "TimeDirectionLines", q + "INCREASE TIME DIRECTION" + q},
      {"InitialGeometry", "OrbitConfiguration", q + "DESCENDING" + q},
      {"InitialGeometry", "ReferenceHeight", "0"},
      {"Processing", "NAzimuthLooks", "1"},
      {"Processing", "NRangeLooks", "1"},
      {"Processing", "SlantRange",
       "{" + g15(t1 * kHalfC) + " " + g15((t1 + 2450 / fs) * kHalfC) + " " + g15((t1 + 4900 / fs) * kHalfC) + "}"},
      {"Processing", "PixelSpacingRg", g15(kHalfC / fs)},
      {"Processing", "PixelSpacingAz", g15(6700.0 / prf)},
      {"Processing", "AzimuthTimeStep", g15(1.0 / prf)},
      {"Processing", "FastTime", "{" + g15(t1) + "}"},
      {"Processing", "AzimuthStartTime", q + first + q},
      {"Processing", "AzimuthStopTime", q + text_of(p.firstLineTime + 29000 / prf) + q},
      {"Processing", "nDopCenDataSet", "1"},
      {"Processing", "DopCenRefTime", "{" + q + first + q + "}"},
      {"Processing", "DopCenRgRefTime", "{0.0056}"},
      {"Processing", "DopCenPol_nCoeff", "{3}"},
      {"Processing", "DopCenRangeCoeff",
       "{" + g15(50.0 + 2.0 * dt) + " " + g15(1.0e5 + 300.0 * dt) + " " + g15(1.0e8) + "}"},
      {"Processing", "ProcessingVelocity", "{6700}"},
      {"Processing", "FromInImageAzimuthLooks", "1"},
      {"Processing", "FromInImageRangeLooks", "1"},
      {"Processing", "SuggestedAzimuthLooks", "5"},
      {"Processing", "SuggestedRangeLooks", "1"},
      {"Processing", "AzimuthGroundPixelSpaceFromSuggestLooks", g15(5 * 6700.0 / prf)},
      {"Processing", "RangeGroundPixelSpaceFromSuggestLooks", g15(kHalfC / fs / std::sin(20.0 * M_PI / 180.0))},
      {"Processing", "DopRateRefTime", "{" + q + first + q + "}"},
      {"Processing", "DopRateRgRefTime", "{0.0055}"},
      {"Processing", "DopRatePol_nCoeff", "{3}"},
      {"Processing", "DopRateRangeCoeff", "{-2100 150000 400000000}"},
      {"ChannelInfo", "CarrierFrequency", "{5331004000}"},
      {"ChannelInfo", "BandWidth", "{16000000}"},
      {"ChannelInfo", "PRF", "{1652.4156}"},
      {"ChannelInfo", "PRFExtracted", "{1652.4156}"},
      {"ChannelInfo", "PulseDuration", "{2.71e-05}"},
      {"ChannelInfo", "SamplingRate", "{19207680}"},
      {"ChannelInfo", "Description", "{\"V/V\"}"},
      {"ChannelInfo", "CalConstProc", "60277386404.1413"},
      {"ChannelInfo", "RangeLookAngle", "17.5"},
      {"ChannelInfo", "IncidenceAngle", "20"},
      {"ChannelInfo", "EnvisatReferenceElevationAngle", "19.8"},
      {"ChannelInfo", "EnvisatTwoWayAntennaElevationPatternTableNbr", "3"},
      {"ChannelInfo", "EnvisatTwoWayAntennaElevationPatternTable", "{0 " + g15(20.0 * std::log10(0.5)) + " -300}"},
      {"RasterInfo", "HeaderOffset", "0"},
      {"RasterInfo", "RowPrefix", "0"},
      {"RasterInfo", "RowSuffix", "0"},
      {"RasterInfo", "CellType", q + "FLOAT_COMPLEX" + q},
      {"RasterInfo", "DataUnits", q + "SLC" + q},
      {"RasterInfo", "NullCellValue", "0"},
      {"RasterInfo", "NrOfPixelsPerLine", "4900"},
      {"RasterInfo", "NrOfLinesPerImage", "29000"},
      {"RasterInfo", "BytesOrder", q + "LSBF" + q},
      {"Sensor", "SensorName", q + "ENVISAT-1" + q},
      {"RegistrationCoordinates", "LatNorthing", "-33.5"},
      {"RegistrationCoordinates", "LonEasting", "180"},
      {"SwathInfo", "Swath", "IS7|"},
  };
  for (const auto& k : keys) EXPECT_EQ(raw(k.section, k.key), k.value) << k.section << "." << k.key;

  using sar::base::GetMyProfileDoubleMatrix;
  using sar::base::GetMyProfileStringMatrix;
  std::array<double, 15> m{};
  ASSERT_EQ(GetMyProfileDoubleMatrix("StateVectorData", "pos", m, 5, 3, header_), 0);
  EXPECT_EQ(m, p.orbitPositions);
  ASSERT_EQ(GetMyProfileDoubleMatrix("StateVectorData", "vel", m, 5, 3, header_), 0);
  EXPECT_EQ(m, p.orbitVelocities);

  std::vector<std::string> info;
  ASSERT_EQ(GetMyProfileStringMatrix("RasterInfo", "OtherInfo", info, 2, 16, header_, 128), 0);
  const std::vector<std::string> expected = {
      "ORIGIN DATA",
      "UTM_HEMISPHERE",
      "UTM_ZONE",
      "CORNER POINT 3  X",
      "CORNER POINT 3  Y",
      "CORNER POINT 4  X",
      "CORNER POINT 4  Y",
      "CORNER POINT 2  X",
      "CORNER POINT 2  Y",
      "CORNER POINT 1  X",
      "CORNER POINT 1  Y",
      "CENTER SCENE POINT X",
      "CENTER SCENE POINT Y",
      "SOFTWARE",
      "ACQUISITION_TIME",
      "SCENE DATA",
      "ENVISAT_IM0",
      "SOUTH",
      "60",
      "179.400000",
      "-33.900000",
      "180.300000",
      "-34.000000",
      "180.400000",
      "-33.100000",
      "179.500000",
      "-33.000000",
      "180.000000",
      "-33.500000",
      "WSfocuser v1.0",
      first,
      "ENVISAT-1|ENVISAT_IM0|IS7|" + first.substr(0, 11) + "|V/V|DESCENDING|SLANT_RANGE"};
  EXPECT_EQ(info, expected);

  // Sections in the order of the tables, the Doppler rate keys closing Processing.
  std::stringstream content;
  content << std::ifstream(header_).rdbuf();
  const std::string text = content.str();
  EXPECT_EQ(text.find("[OrbitCorrection]"), 0u);
  size_t last = 0;
  for (const char* mark : {"[StateVectorData]", "[InitialGeometry]", "[Processing]", "[ChannelInfo]", "[RasterInfo]",
                           "[Sensor]", "[RegistrationCoordinates]", "[SwathInfo]"}) {
    const size_t at = text.find(mark);
    ASSERT_NE(at, std::string::npos) << mark;
    EXPECT_GT(at, last) << mark;
    last = at;
  }
  EXPECT_LT(text.find("RangeGroundPixelSpaceFromSuggestLooks"), text.find("DopRateRefTime"));
  EXPECT_LT(text.find("DopRateRangeCoeff"), text.find("[ChannelInfo]"));
}

TEST_F(AnnotationTest, DescriptionAndRasterHeaderFollowTheAnnotation) {
  const Scene s;
  ASSERT_EQ(run(s), 0);
  ASSERT_TRUE(fs::exists(slc_ + ".sml"));
  // libxml2 reads it as well-formed XML (just not as one of its own header documents).
  sar::metadata::ombrixxml doc;
  EXPECT_EQ(doc.initXmlFile(slc_ + ".sml"), sar::metadata::XmlOpenResult::kNotHeader);

  sar::io::CSectionDataGroup g{"RasterInfo", "ChannelInfo", "Processing", "InitialGeometry", "OrbitCorrection"};
  ASSERT_EQ(g.read(slc_ + ".sml"), 0);
  int64_t n = 0;
  double v = 0.0;
  std::string t;
  EXPECT_EQ(g.getInteger("RasterInfo.NrOfLinesPerImage", n), 0);
  EXPECT_EQ(n, 29000);
  EXPECT_EQ(g.getString("ChannelInfo.Description", t), 0);
  EXPECT_EQ(t, "V/V");
  EXPECT_EQ(g.getString("RasterInfo.OtherInfo", t, 18), 0);
  EXPECT_EQ(t, "60");
  EXPECT_EQ(g.getDouble("Processing.DopRateRangeCoeff", v, 2), 0);
  EXPECT_EQ(v, 4.0e8);
  EXPECT_EQ(g.getString("InitialGeometry.OrbitConfiguration", t), 0);
  EXPECT_EQ(t, "DESCENDING");
  EXPECT_EQ(g.getDouble("ChannelInfo.EnvisatTwoWayAntennaElevationPatternTable", v, 0), 0);
  EXPECT_EQ(v, 0.0);
  const std::string xml = [&] {
    std::stringstream c;
    c << std::ifstream(slc_ + ".sml").rdbuf();
    return c.str();
  }();
  EXPECT_EQ(xml.find("SwathInfo"), std::string::npos);  // not a section of the description
  EXPECT_LT(xml.find("<GCPRasterInfo>"), xml.find("<EnvisatDescriptionRecord>"));

  sar::io::DataFile raster;
  ASSERT_EQ(raster.read_hdr(slc_), 0);
  EXPECT_EQ(raster.lines, 29000);
  EXPECT_EQ(raster.pixels, 4900);
  EXPECT_EQ(raster.cellType, sar::io::kFloatComplex);
}

TEST_F(AnnotationTest, ARerunReplacesTheOlderProductFiles) {
  {
    std::ofstream stale(slc_ + ".sml");
    stale << "<?xml version=\"1.0\" ?>\n<HEADER_INFO><Stale><X>1</X></Stale>"
             "<RasterInfo><NrOfLinesPerImage>1</NrOfLinesPerImage></RasterInfo></HEADER_INFO>\n";
  }
  Scene s;
  ASSERT_EQ(run(s), 0);
  std::stringstream c;
  c << std::ifstream(slc_ + ".sml").rdbuf();
  EXPECT_EQ(c.str().find("Stale"), std::string::npos);
  EXPECT_NE(c.str().find("<NrOfLinesPerImage>29000</NrOfLinesPerImage>"), std::string::npos);

  // A second run in the same process: nothing of the first stays in the annotation.
  s.proc.focusedLines = 28000;
  ASSERT_EQ(write_stripmap_annotation(header_, s.par, s.proc, s.az,
                                      AnnotationProduct{"ENVISAT_AP0", "ENVISAT-1|ENVISAT_AP0|", false}),
            0);
  EXPECT_EQ(raw("RasterInfo", "NrOfLinesPerImage"), "28000");
  EXPECT_EQ(raw("ChannelInfo", "PRFExtracted"), "<absent>");
}

TEST_F(AnnotationTest, PassDirectionAndShiftFollowTheFocusedGeometry) {
  Scene s;
  // Moving north at the scene centre; the first line landed 12.5 lines later than the
  // overlap alone puts it, with a geometric shift asked for.
  for (size_t k = 0; k < 5; ++k) s.proc.orbitVelocities[3 * k + 2] = 6500.0 + k;
  s.az.azimuthShift = s.par.lines;
  s.proc.firstLineTime = kT0 + (500 + 12.5) / s.par.prf;
  ASSERT_EQ(run(s), 0);
  EXPECT_EQ(raw("InitialGeometry", "OrbitConfiguration"), "\"ASCENDING\"");
  EXPECT_EQ(raw("InitialGeometry", "SceneHeading"), "344");
  double shift = 0.0;
  ASSERT_EQ(sar::base::GetProfileDoubleArray("OrbitCorrection", "AzimuthPixelShift", {&shift, 1}, header_), 0);
  EXPECT_NEAR(shift, 12.5, 1e-3);

  // z velocity crossing zero inside the span: the centre decides.
  for (size_t k = 0; k < 5; ++k) s.proc.orbitVelocities[3 * k + 2] = -20.0 + 10.0 * static_cast<double>(k);
  EXPECT_FALSE(pass_is_ascending(s.proc, s.proc.orbitStartTime + 1.0 * s.proc.orbitSpacing));
  EXPECT_TRUE(pass_is_ascending(s.proc, s.proc.orbitStartTime + 3.0 * s.proc.orbitSpacing));
}

TEST(AnnotationHelpers, UtmZonesAndSuggestedLooks) {
  struct Zone {
    double longitude;
    int zone;
  };
  for (const Zone z : {Zone{-180.0, 1}, Zone{-179.0, 1}, Zone{181.0, 1}, Zone{180.0, 60}, Zone{179.99, 60},
                       Zone{0.0, 31}, Zone{-0.5, 30}, Zone{6.0, 32}, Zone{359.0, 30}, Zone{-181.0, 60}}) {
    EXPECT_EQ(utm_zone(z.longitude), z.zone) << z.longitude;
  }
  EXPECT_EQ(utm_zone(std::nan("")), 0);

  struct Looks {
    double rg, az, incidence;
    int rangeLooks, azimuthLooks;
    double rangeSpace, azimuthSpace;
  };
  const double g = 7.8 / std::sin(20.0 * M_PI / 180.0);
  for (const Looks l : {Looks{7.8, 4.05, 20.0, 1, 5, g, 5 * 4.05}, Looks{5.0, 5.0, 90.0, 1, 1, 5.0, 5.0},
                        Looks{3.0, 10.0, 90.0, 3, 1, 9.0, 10.0}, Looks{-3.0, -10.0, 90.0, 3, 1, 9.0, 10.0},
                        Looks{7.8, 0.0, 20.0, 1, 1, g, 0.0}}) {
    int rl = 0, al = 0;
    double rs = 0.0, as = 0.0;
    EXPECT_EQ(ComputeSuggestedLooks(l.rg, l.az, l.incidence, 90.0, rl, al, rs, as), 0);
    EXPECT_EQ(rl, l.rangeLooks) << l.rg << " " << l.az;
    EXPECT_EQ(al, l.azimuthLooks) << l.rg << " " << l.az;
    EXPECT_NEAR(rs, l.rangeSpace, 1e-9);
    EXPECT_NEAR(as, l.azimuthSpace, 1e-9);
  }
  EXPECT_EQ(polarisation_text(2), "H/V");
  EXPECT_EQ(polarisation_text(9), "");
}

}  // namespace

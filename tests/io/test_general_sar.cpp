// Data set containers: what GSwrite puts in a header GSread finds again, slot by slot; the
// fixed raw and focused sets refuse a header that lacks one of their records.
#include <fstream>
#include <string>

#include <gtest/gtest.h>

#include "io/general_sar.hpp"
#include "io_test_util.hpp"

using namespace sar::io;
using sar::io::test::TempDirTest;

namespace {

class GeneralSarTest : public TempDirTest {};

// A raw data set as an extraction describes it.
void describe_raw(GeneralSAR& gs, const std::string& raster) {
  gs.dataFile.fileName = raster;
  gs.dataFile.lines = 2560;
  gs.dataFile.pixels = 2048;
  gs.dataFile.rowPrefix = 4;
  gs.dataFile.cellType = kFloatComplex;
  gs.roi.SetSlowAxe(529338594.55, 1.0 / 1256.99, 2560);
  gs.roi.SetFastAxe(0.0067, 1.0 / 18.47e6, 2048);
  gs.sampling.fc_hz = 5.3e9;
  gs.sampling.frg_hz = 18.47e6;
  gs.sampling.Brg_hz = 17.28e6;
  gs.sampling.Trg_s = 1.0 / 18.47e6;
  gs.sampling.prf_hz = 1256.99;
  gs.sampling.pri_s = 1.0 / 1256.99;
  gs.sampling.Baz_hz = 1256.99;
  gs.sampling.lambda_m = 0.05656;
  gs.stateVectors.SVCreate(529338500.0, 60.0, 5);
  for (std::size_t i = 0; i < gs.stateVectors.pos.size(); ++i) {
    gs.stateVectors.pos[i] = 7.0e6 - 1000.0 * static_cast<double>(i);
    gs.stateVectors.vel[i] = 7.5e3 - static_cast<double>(i);
  }
  gs.pulse.PulseLength = 42e-6;
  gs.pulse.Bandwidth = 17.28e6;
  gs.pulse.PulseKRate = 17.28e6 / 42e-6;
  gs.pulse.PulseEnergy = 1.0;
  gs.pulse.PulseSamplingRate = 18.47e6;
  for (std::string* s :
       {&gs.info.OrbitNumber, &gs.info.Track, &gs.info.SenseDate, &gs.info.SceneID, &gs.info.Description,
        &gs.info.AcquisitionStation, &gs.info.ProcessingCenter, &gs.info.ProcessingDate, &gs.info.ProcessingSoftware})
    *s = std::string(1, 'x');
  gs.info.SensorName = "RADARSAT-1";
  gs.info.Swath = "S3";
  gs.attitude.AntennaLength = 15.0;
  gs.swath.Rank = 8;
}

}  // namespace

TEST_F(GeneralSarTest, WrittenSlotsReadBackAndOnlyThey) {
  struct Case {
    const char* name;
    std::vector<GSObject> slots;
  };
  const Case cases[] = {
      {"raster and region", {kGSDataFile, kGSRoi}},
      {"raw set",
       {kGSDataFile, kGSRoi, kGSSamplingConstants, kGSStateVectors, kGSPulse, kGSDataSetInfo, kGSSensorAttitude,
        kGSSwathInfo}},
      {"records without raster", {kGSSamplingConstants, kGSPulse, kGSAntennaPattern, kGSGeoCoords}},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    const std::string raster = file(sar::io::test::numbered("set", static_cast<int>(&c - cases)));
    GeneralSAR out;
    describe_raw(out, raster);
    for (GSObject s : c.slots) out.GSenable(s);
    ASSERT_EQ(out.GSwrite(header_of(raster)), 0);

    GeneralSAR in;
    ASSERT_EQ(in.GSread(header_of(raster)), 0);
    for (int s = 0; s < kGSObjects; ++s) {
      const auto slot = static_cast<GSObject>(s);
      bool expected = std::find(c.slots.begin(), c.slots.end(), slot) != c.slots.end();
      // The orbit is the state vectors' record seen again.
      if (slot == kGSOrbit) expected = out.GSexists(kGSStateVectors);
      // The buffered stream shares the raster's description.
      if (slot == kGSBufferFile) expected = out.GSexists(kGSDataFile);
      EXPECT_EQ(in.GSexists(slot), expected) << "slot " << s;
    }
    if (in.GSexists(kGSDataFile)) {
      EXPECT_EQ(in.dataFile.lines, 2560);
      EXPECT_EQ(in.dataFile.pixels, 2048);
      EXPECT_EQ(in.dataFile.rowPrefix, 4);
      EXPECT_EQ(in.dataFile.fileName, raster);  // no ".hdr.hdr"
    }
    if (in.GSexists(kGSRoi)) {
      EXPECT_DOUBLE_EQ(in.roi.slowStart, 529338594.55);
    }
    if (in.GSexists(kGSStateVectors)) {
      EXPECT_EQ(in.stateVectors.pos, out.stateVectors.pos);
      EXPECT_EQ(in.orbit.vel, out.stateVectors.vel);
      EXPECT_DOUBLE_EQ(in.orbit.lambda, 0.05656);
    }
    if (in.GSexists(kGSPulse)) {
      EXPECT_NEAR(in.pulse.PulseKRate, out.pulse.PulseKRate, 1e-14 * out.pulse.PulseKRate);  // 15 digits
    }
    if (in.GSexists(kGSAntennaPattern)) {
      EXPECT_EQ(in.pattern.PatternSamples, 0);
    }
  }
}

TEST_F(GeneralSarTest, FixedSetsNeedEveryRecord) {
  const std::string raster = file("RAW");
  GeneralRAWData raw;
  describe_raw(raw, raster);
  ASSERT_EQ(raw.writehdr(raster), 0);
  GeneralRAWData back;
  ASSERT_EQ(back.readhdr(raster), 0);
  EXPECT_EQ(back.info.Swath, "S3");
  EXPECT_EQ(back.swath.Rank, 8);
  EXPECT_DOUBLE_EQ(back.orbit.lambda, 0.05656);
  // The raw set is no focused set: no polynomials, pattern, windows or corners.
  GeneralSLCData slc;
  EXPECT_NE(slc.readhdr(raster), 0);

  // Every record of the raw set is required: a header written without one is refused.
  for (GSObject missing : {kGSDataFile, kGSRoi, kGSSamplingConstants, kGSStateVectors, kGSPulse, kGSDataSetInfo,
                           kGSSensorAttitude, kGSSwathInfo}) {
    SCOPED_TRACE(static_cast<int>(missing));
    const std::string other = file(sar::io::test::numbered("partial", static_cast<int>(missing)));
    GeneralSAR partial;
    describe_raw(partial, other);
    for (GSObject s : {kGSDataFile, kGSRoi, kGSSamplingConstants, kGSStateVectors, kGSPulse, kGSDataSetInfo,
                       kGSSensorAttitude, kGSSwathInfo})
      partial.GSenable(s, s != missing);
    ASSERT_EQ(partial.GSwrite(header_of(other)), 0);
    GeneralRAWData refused;
    EXPECT_NE(refused.readhdr(other), 0);
  }
}

TEST_F(GeneralSarTest, MissingHeaderIsAnErrorAbsentRecordsAreNot) {
  GeneralSAR gs;
  EXPECT_EQ(gs.GSread(file("nothing.hdr")), 1);
  std::ofstream(file("empty.hdr")) << "[Other]\nKey = 1\n";
  ASSERT_EQ(gs.GSread(file("empty.hdr")), 0);
  for (int s = 0; s < kGSObjects; ++s) EXPECT_FALSE(gs.GSexists(static_cast<GSObject>(s))) << s;
}

TEST_F(GeneralSarTest, DamagedHeadersGiveAbsentRecordsNeverACrash) {
  const std::string xmlHead =
      "<?xml version=\"1.0\"?>\n<OmbrixXmlDoc><Description>x</Description>"
      "<NumberOfChannels>1</NumberOfChannels><Channel Number=\"1\">";
  const struct {
    const char* name;
    std::string text;
  } cases[] = {
      {"binary", std::string("\x00\x01\xff\xfe[[[=\n\x80", 10)},
      {"truncated xml", std::string(xmlHead).append("<SamplingConstants><fc_hz>5.3e9</fc")},
      {"huge vector count", "[StateVectorData]\nnStateVectors = 2000000000\nTimeFirst = 1\nTimeDelta = 1\n"},
      {"vector count without vectors",
       "[StateVectorData]\nnStateVectors = 5\nTimeFirst = 1\nTimeDelta = 1\npos = {1 2 3}\n"},
      {"negative pattern", "[AntennaPattern]\nPatternSamples = -5\n"},
      {"huge burst count", "[SwathInfo]\nBursts = 2147483647\n"},
      {"raster of impossible size", "[RasterInfo]\nNrOfLinesPerImage = -3\nNrOfPixelsPerLine = 5\n"},
      {"text for numbers",
       "[SamplingConstants]\nfc_hz = fast\nfrg_hz = 1\nBrg_hz = 1\nTrg_s = 1\nprf_hz = 1\n"
       "pri_s = 1\nBaz_hz = 1\nbrf_hz = 0\nbri_s = 0\nlambda_m = 1\n"},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.name);
    const std::string raster = file(sar::io::test::numbered("damaged", static_cast<int>(&c - cases)));
    const std::string path = header_of(raster);
    std::ofstream(path, std::ios::binary) << c.text;
    GeneralSAR gs;
    EXPECT_EQ(gs.GSread(path), 0);
    for (int s = 0; s < kGSObjects; ++s) EXPECT_FALSE(gs.GSexists(static_cast<GSObject>(s))) << s;
    GeneralRAWData raw;
    EXPECT_NE(raw.readhdr(raster), 0);
  }
}

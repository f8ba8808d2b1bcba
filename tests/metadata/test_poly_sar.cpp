// Scene polynomial sets: evaluation, selection and interpolation along azimuth, header files.
#include <unistd.h>

#include <filesystem>
#include <fstream>
#include <string>

#include <gtest/gtest.h>

#include "base/profile.hpp"
#include "metadata/ombrixxml.hpp"
#include "metadata/poly_sar.hpp"

namespace fs = std::filesystem;
using namespace sar::metadata;

namespace {

class PolySarFiles : public ::testing::Test {
 protected:
  void SetUp() override {
    dir_ = fs::temp_directory_path() / ("sar_polysar_" + std::to_string(::getpid()) + "_" +
                                        ::testing::UnitTest::GetInstance()->current_test_info()->name());
    fs::remove_all(dir_);
    fs::create_directories(dir_);
  }
  void TearDown() override {
    sar::base::FreeProfile();
    fs::remove_all(dir_);
  }
  std::string file(const char* name) const { return (dir_ / name).string(); }
  fs::path dir_;
};

/// Three polynomials 10 s apart in azimuth whose constant term is ten times their reference.
polySAR three_dc() {
  polySAR s;
  EXPECT_EQ(s.CreatePolys(3, 3, 1, 1, 1, 1), 0);
  for (int k = 0; k < 3; ++k) {
    const double t = 10.0 * (k + 1);
    s.dc[static_cast<size_t>(k)] = polyDC({10.0 * t, 1.0, 0, 0, 0, 0, 0}, 100.0 * k, t);
    s.fr[static_cast<size_t>(k)] = polyFR({-10.0 * t, 0, 0, 0, 0, 0, 0}, 0.0, t);
  }
  return s;
}

TEST(Poly, EvaluatesAllSevenTermsAroundItsReference) {
  // r = 2, a = 1: 1 + 2*2 + 3*1 + 4*1*2 + 5*4 + 6*8 + 7*16
  const poly p({1, 2, 3, 4, 5, 6, 7}, 10.0, 100.0);
  double v = 0.0;
  EXPECT_EQ(p.EvaluatePoly(12.0, 101.0, v), 0);
  EXPECT_DOUBLE_EQ(v, 196.0);
  EXPECT_DOUBLE_EQ(p.value(10.0, 100.0), 1.0);
}

TEST(PolySar, SelectionTakesTheLastPolynomialAtOrBeforeTheQuery) {
  const polySAR s = three_dc();
  struct Case {
    double azimuth;
    int index;
  };
  for (const Case c :
       {Case{5.0, 0}, Case{10.0, 0}, Case{15.0, 0}, Case{20.0, 1}, Case{29.999, 1}, Case{30.0, 2}, Case{500.0, 2}}) {
    int index = -1;
    double v = 0.0;
    ASSERT_EQ(s.getDCnum(c.azimuth, index), 0);
    EXPECT_EQ(index, c.index) << c.azimuth;
    // At the range reference the value is the constant term plus nothing else.
    ASSERT_EQ(s.EvaluateDC(100.0 * c.index, c.azimuth, v), 0);
    EXPECT_DOUBLE_EQ(v, 100.0 * (c.index + 1)) << c.azimuth;
  }
}

TEST(PolySar, InterpolationIsLinearInsideAndExtrapolatesOutside) {
  const polySAR s = three_dc();
  struct Case {
    double azimuth;
    double constant;
  };
  for (const Case c : {Case{15.0, 150.0}, Case{20.0, 200.0}, Case{27.5, 275.0}, Case{30.0, 300.0}, Case{35.0, 350.0},
                       Case{5.0, 50.0}, Case{0.0, 0.0}}) {
    std::array<double, kPolyCoefficients> dc{};
    std::array<double, kPolyCoefficients> fr{};
    ASSERT_EQ(s.getDCpoly(c.azimuth, dc), 0);
    ASSERT_EQ(s.getFRpoly(c.azimuth, fr), 0);
    EXPECT_NEAR(dc[0], c.constant, 1e-9) << c.azimuth;
    EXPECT_NEAR(fr[0], -c.constant, 1e-9) << c.azimuth;
    EXPECT_DOUBLE_EQ(dc[1], 1.0);
  }
  // The interpolated evaluation takes the range reference of the selected polynomial: at 15 s
  // that of polynomial 0 (0), at 25 s that of polynomial 1 (100).
  double v = 0.0;
  ASSERT_EQ(s.EvaluateDCinterp(0.0, 15.0, v), 0);
  EXPECT_NEAR(v, 150.0, 1e-9);
  ASSERT_EQ(s.EvaluateDCinterp(0.0, 25.0, v), 0);
  EXPECT_NEAR(v, 250.0 - 100.0, 1e-9);
}

TEST(PolySar, GeometricSetsSelectWithoutInterpolating) {
  polySAR s;
  ASSERT_EQ(s.CreatePolys(0, 0, 2, 0, 2, 0), 0);
  s.sl2gr[0] = polySL2GR({1000.0, 0, 0, 0, 0, 0, 0}, 0.0, 10.0);
  s.sl2gr[1] = polySL2GR({2000.0, 0, 0, 0, 0, 0, 0}, 0.0, 20.0);
  std::array<double, kPolyCoefficients> c{};
  ASSERT_EQ(s.getSL2GRpoly(19.0, c), 0);
  EXPECT_DOUBLE_EQ(c[0], 1000.0);
  double v = 0.0;
  ASSERT_EQ(s.EvaluateSL2GRinterp(0.0, 25.0, v), 0);
  EXPECT_DOUBLE_EQ(v, 2000.0);
}

TEST(PolySar, EmptySetsAreRejected) {
  polySAR s;
  ASSERT_EQ(s.CreatePolys(1, 0), 0);
  double v = 0.0;
  std::array<double, kPolyCoefficients> c{};
  int index = 0;
  EXPECT_EQ(s.EvaluateDC(0.0, 0.0, v), 0);
  EXPECT_EQ(s.EvaluateFR(0.0, 0.0, v), kPolyRejected);
  EXPECT_EQ(s.EvaluateSL2GR(0.0, 0.0, v), kPolyRejected);
  EXPECT_EQ(s.EvaluateGR2SLinterp(0.0, 0.0, v), kPolyRejected);
  EXPECT_EQ(s.EvaluateSL2THETA(0.0, 0.0, v), kPolyRejected);
  EXPECT_EQ(s.getSL2PHIpoly(0.0, c), kPolyRejected);
  EXPECT_EQ(s.getFRnum(0.0, index), kPolyRejected);
  EXPECT_EQ(s.CreatePolys(-1, 0), kPolyRejected);
}

TEST_F(PolySarFiles, XmlHeaderRoundTripsAndARewriteDropsOldMembers) {
  const std::string path = file("scene.xml");
  polySAR s = three_dc();
  s.sl2theta[0] = polySL2THETA({20.0, 1e5, 0, 0, -3e9, 0, 0}, 5.5e-3, 7.0e8);
  ASSERT_EQ(s.writehdr(path), 0);

  polySAR r;
  ASSERT_EQ(r.readhdr(path), 0);
  ASSERT_EQ(r.dc.size(), 3u);
  ASSERT_EQ(r.sl2theta.size(), 1u);
  EXPECT_EQ(r.ndc, 3);
  EXPECT_EQ(r.dc[2].taz0_s, 30.0);
  EXPECT_EQ(r.dc[1].trg0_s, 100.0);
  EXPECT_EQ(r.sl2theta[0].pol, s.sl2theta[0].pol);
  EXPECT_EQ(r.sl2theta[0].taz0_s, 7.0e8);

  // The members sit under PolySAR with their set's name and index.
  ombrixxml doc;
  ASSERT_EQ(doc.initXmlFile(path), XmlOpenResult::kOk);
  double t = 0.0;
  EXPECT_EQ(doc.readDouble(1, "PolySAR/DopplerRate-2/taz0_s", {&t, 1}), 0);
  EXPECT_EQ(t, 30.0);
  doc.clean();

  polySAR smaller;
  ASSERT_EQ(smaller.CreatePolys(1, 0), 0);
  ASSERT_EQ(smaller.writehdr(path), 0);
  ASSERT_EQ(doc.initXmlFile(path), XmlOpenResult::kOk);
  EXPECT_NE(doc.readDouble(1, "PolySAR/DopplerCentroid-2/taz0_s", {&t, 1}), 0);
  ASSERT_EQ(r.readhdr(path), 0);
  EXPECT_EQ(r.dc.size(), 1u);
  EXPECT_TRUE(r.fr.empty());
}

TEST_F(PolySarFiles, ImpossibleCountsAreRefusedBeforeAllocation) {
  const std::string path = file("bad.xml");
  {
    std::ofstream out(path);
    out << "<OmbrixXmlDoc><NumberOfChannels>1</NumberOfChannels><Description>x</Description>"
           "<Channel Number=\"1\"><PolySAR><ndc>2000000000</ndc><nfr>0</nfr><nsl2gr>0</nsl2gr>"
           "<ngr2sl>0</ngr2sl><nsl2theta>0</nsl2theta><nsl2phi>0</nsl2phi></PolySAR></Channel></OmbrixXmlDoc>";
  }
  polySAR r;
  EXPECT_NE(r.readhdr(path), 0);
  EXPECT_TRUE(r.dc.empty());
}

TEST_F(PolySarFiles, ProfileFilesFallBackToTheOlderKeys) {
  const std::string path = file("old_hdr");
  {
    std::ofstream out(path);
    out << "[Doppler]\nDCpoly = {10 2 3 0 0 0 0}\nDCpoly_rgt0 = 0.005\nDCpoly_azt0 = 700000000\n"
           "[Oldest]\nDCpoly = {1 2 3 4 5 6 7 0.006 7e8}\nFRpoly = {-2000 1 0 0 0 0 0 0.004 0}\n";
  }
  polyDC dc;
  ASSERT_EQ(dc.readpar(path, "Doppler"), 0);
  EXPECT_EQ(dc.pol[0], 10.0);
  EXPECT_EQ(dc.trg0_s, 0.005);
  EXPECT_EQ(dc.taz0_s, 7e8);
  polyFR fr;
  EXPECT_NE(fr.readpar(path, "Doppler"), 0);  // no older keys of its own

  ASSERT_EQ(dc.readparold(path, "Oldest"), 0);
  EXPECT_EQ(dc.pol[6], 7.0);
  EXPECT_EQ(dc.trg0_s, 0.006);
  ASSERT_EQ(fr.readparold(path, "Oldest"), 0);
  EXPECT_EQ(fr.pol[0], -2000.0);
  EXPECT_EQ(fr.trg0_s, 0.004);

  // A profile header written by the set itself reads back through the same path.
  const std::string own = file("own_hdr");
  { std::ofstream(own) << "[Other]\nkey = 1\n"; }
  polySAR s = three_dc();
  ASSERT_EQ(s.writehdr(own), 0);
  polySAR r;
  ASSERT_EQ(r.readhdr(own), 0);
  ASSERT_EQ(r.fr.size(), 3u);
  EXPECT_EQ(r.fr[1].pol[0], -200.0);
}

}  // namespace

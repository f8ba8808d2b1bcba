// The omega-K block's equivalent velocity and reference range, fitted to the Doppler rate at the
// block's two ends, against a hyperbolic geometry whose beam-centre centroid changes across the
// block (an unsteered platform: several PRFs of centroid, a steep range slope). The rate at
// either end is that of the beam centre there, so the fit must see either end's squint.
#include <cmath>

#include <gtest/gtest.h>

#include "stripmap/omegak.hpp"

namespace {

constexpr double kC = 299792458.0;
constexpr double kF0 = 5.3e9;
constexpr double kFs = 18.47e6;

struct Geometry {
  double V;      // m/s
  double tau1;   // two-way time of the block's first sample, s
  double fd1;    // beam-centre centroid there, Hz
  double slope;  // its change with two-way time, Hz/s
  int samples;

  double lambda() const { return kC / kF0; }
  double fd(double tau) const { return fd1 + slope * (tau - tau1); }
  // Beam-centre rate of the hyperbolic history: -2 (V^2 - p^2) / (lambda R), p = lambda fd / 2.
  double rate(double tau) const {
    const double p = lambda() * fd(tau) / 2.0;
    return -2.0 * (V * V - p * p) / (lambda() * 0.5 * kC * tau);
  }
};

sar::stripmap::wkparm block_of(const Geometry& g, bool withEnds) {
  sar::stripmap::wkparm wk;
  wk.samples = g.samples;
  wk.fs = kFs;
  wk.carrier = kF0;
  wk.PerformInterpolation = 1;
  wk.nearTime = g.tau1;
  wk.rateReference = g.tau1;
  const double Tr = g.samples / kFs;
  // The quadratic through the rate at the near end, the middle and the far end.
  const double r0 = g.rate(g.tau1), rm = g.rate(g.tau1 + Tr / 2), r1 = g.rate(g.tau1 + Tr);
  const double h = Tr / 2;
  wk.rate = {r0, (4 * rm - 3 * r0 - r1) / (2 * h), (r1 - 2 * rm + r0) / (2 * h * h)};
  wk.fd = g.fd(g.tau1 + Tr / 2);
  if (withEnds) {
    wk.fdNear = g.fd(g.tau1);
    wk.fdFar = g.fd(g.tau1 + Tr);
  }
  return wk;
}

}  // namespace

TEST(EquivalentVelocity, FitSeesTheSquintAtEitherEndOfTheBlock) {
  struct Case {
    const char* name;
    Geometry g;
  };
  const Case cases[] = {
      {"yaw-steered, small centroid", {7100.0, 0.0056, 300.0, 0.0, 2048}},
      {"six PRFs, range slope", {7080.0, 0.0067, 7690.0, 1.7e6, 2048}},
      {"minus six PRFs, falling", {7120.0, 0.0062, -7500.0, -2.2e6, 4096}},
      {"no centroid", {7050.0, 0.0059, 0.0, 0.0, 1024}},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    auto wk = block_of(c.g, true);
    ASSERT_EQ(sar::stripmap::MyComputeEqPar(wk), 0);
    // A relative error of 1e-5 in V moves a target at six PRFs by about a tenth of a line.
    EXPECT_NEAR(wk.V / c.g.V - 1.0, 0.0, 1e-7);
    const double p1 = c.g.lambda() * c.g.fd1 / 2.0;
    const double closest = 0.5 * kC * c.g.tau1 * std::sqrt(1.0 - p1 * p1 / (c.g.V * c.g.V));
    EXPECT_NEAR(wk.R0, closest, 0.05);

    // Given only the centre's centroid, a constant centroid is still fitted exactly.
    auto centreOnly = block_of(c.g, false);
    ASSERT_EQ(sar::stripmap::MyComputeEqPar(centreOnly), 0);
    if (c.g.slope == 0.0) {
      EXPECT_NEAR(centreOnly.V / c.g.V - 1.0, 0.0, 1e-7);
    }
  }
}

TEST(EquivalentVelocity, RefusesARateThatDoesNotChange) {
  Geometry g{7100.0, 0.0056, 300.0, 0.0, 2048};
  auto wk = block_of(g, true);
  wk.rate = {wk.rate[0], 0.0, 0.0};
  EXPECT_EQ(sar::stripmap::MyComputeEqPar(wk), 1);
}

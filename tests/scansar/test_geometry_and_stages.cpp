// The derived acquisition of a simulated wide swath product against the simulator's timeline,
// the burst Doppler estimation, resuming a run after range and Doppler, and bad input.
#include <gtest/gtest.h>

#include <cmath>
#include <complex>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <string>
#include <functional>
#include <random>
#include <vector>

#include "base/errors.hpp"
#include "base/profile.hpp"
#include "dsp/fft.hpp"
#include "envisat/aux_products.hpp"
#include "ws_fixture.hpp"

using namespace sar::scansar;
namespace sim = sar::simulator;

namespace {

std::vector<char> slurp(const std::string& path) {
  std::ifstream in(path, std::ios::binary);
  return {std::istreambuf_iterator<char>(in), std::istreambuf_iterator<char>()};
}

struct GeometryCase {
  const char* name;
  std::array<int, 5> order;
  int firstCounter;  // -1: the acquisition start
};

class DerivedGeometry : public ::testing::TestWithParam<GeometryCase> {};

TEST_P(DerivedGeometry, MatchesTheSimulatorsTimeline) {
  const GeometryCase& g = GetParam();
  sim::SimulationConfig c = sar::test::ws_product(std::string("geometry_") + g.name, g.order, 4, 640);
  c.first_counter = g.firstCounter;
  const sim::SimulationTruth& t = sar::test::simulated(c);
  sar::test::WsInputs x;
  sar::test::prepare(t, c.out_dir + "/run", x);
  ASSERT_FALSE(HasFatalFailure());
  scansar scan;
  ASSERT_EQ(derive_geometry(x.channels, scan), 0);
  EXPECT_EQ(scan.bursts, t.whole_cycles);
  EXPECT_DOUBLE_EQ(scan.cycleTime, x.channels[0].cycle_time);  // the extraction's
  EXPECT_DOUBLE_EQ(scan.firstLineTime, x.channels[0].azimuthStartTime);
  // First echo of each sub-swath in the first whole cycle, from the simulator's packets.
  const long long firstCycle = (t.first_cycle_counter - 525) / t.cycle_packets;
  std::array<double, 5> firstEcho{};
  std::array<double, 5> nextCycleEcho{};
  for (const sim::PacketTruth& p : t.packets) {
    if (p.kind != sim::PacketKind::kEcho || !p.burst_start) continue;
    if (p.cycle == firstCycle) firstEcho[static_cast<std::size_t>(p.channel)] = p.time;
    if (p.cycle == firstCycle + 1) nextCycleEcho[static_cast<std::size_t>(p.channel)] = p.time;
  }
  for (int k = 0; k < 5; ++k) {
    SCOPED_TRACE("position " + std::to_string(k));
    const auto s = static_cast<std::size_t>(g.order[static_cast<std::size_t>(k)]);
    EXPECT_EQ(scan.order[static_cast<std::size_t>(k)], g.order[static_cast<std::size_t>(k)]);
    EXPECT_EQ(scan.successor[s], g.order[static_cast<std::size_t>((k + 1) % 5)]);
    // Stamps are whole microseconds.
    EXPECT_NEAR(scan.burstOffset[s], firstEcho[s] - t.first_line_time, 1.5e-6);
    EXPECT_NEAR(scan.cycleTime, nextCycleEcho[s] - firstEcho[s], 1.5e-6);
    EXPECT_NEAR(scan.nearTime[s], t.channels[s].near_range_time, 1e-12);
    EXPECT_EQ(scan.farTime[s], scan.nearTime[s]);  // no window change in these products
    EXPECT_EQ(scan.spread[s], 0);
    EXPECT_EQ(scan.fftLength[s], sar::dsp::genpow(640, 1));
    EXPECT_EQ(scan.echoes[s], t.channels[s].burst_echoes);
    EXPECT_DOUBLE_EQ(scan.prf[s], t.channels[s].prf);
  }
  EXPECT_EQ(scan.burstOffset[static_cast<std::size_t>(g.order[0])], 0.0);
}

INSTANTIATE_TEST_SUITE_P(Orders, DerivedGeometry,
                         ::testing::Values(GeometryCase{"identity", {0, 1, 2, 3, 4}, -1},
                                           GeometryCase{"permuted_mid_cycle", {0, 2, 4, 1, 3}, 525 + 357 + 100}),
                         [](const auto& info) { return std::string(info.param.name); });

// ---------------------------------------------------------------------------------------------
// Burst Doppler: a squinted product, the data's centroid against the targets' beam-centre
// Doppler, the joint ambiguity and the cross-check against the orbit's prediction.

class BurstDoppler : public ::testing::Test {
 protected:
  static void SetUpTestSuite() {
    config_ = new sim::SimulationConfig(sar::test::ws_product("doppler", {0, 1, 2, 3, 4}, 10, 640, 8));
    config_->centroid_hz = 2500.0;
    truth_ = &sar::test::simulated(*config_);
    x_ = new sar::test::WsInputs;
    sar::test::prepare(*truth_, config_->out_dir + "/run", *x_);
    if (HasFatalFailure()) return;
    ASSERT_EQ(derive_geometry(x_->channels, scan_), 0);
    ASSERT_EQ(check_bursts(scan_, par_), 0);
    for (int s = 0; s < 5; ++s)
      ASSERT_EQ(burst_range_focus(x_->dir, s, x_->channels[static_cast<std::size_t>(s)], scan_, par_, x_->refs.replica,
                                  focused_[static_cast<std::size_t>(s)], sums_[static_cast<std::size_t>(s)]),
                0);
  }
  static void TearDownTestSuite() {
    delete x_;
    delete config_;
  }
  // The orbit's prediction, modelled as the truth's centroid of each sub-swath plus an error.
  static GeometricCentroid prediction(double error) {
    return [error](const sar::metadata::SceneReferences&, double, double tau, double) {
      // The targets' centroids at their range, interpolated across the swath.
      double best = 1e30, value = 0.0;
      for (const sim::TargetTruth& tt : truth_->targets)
        if (std::abs(tt.range_time - tau) < best) {
          best = std::abs(tt.range_time - tau);
          value = tt.doppler_centroid;
        }
      return value + error;
    };
  }
  static double centroid_at(const DopplerEstimate& est, int s, double tau) {
    const auto& c = est.centroid[static_cast<std::size_t>(s)];
    const double x = tau - est.refTime;
    return c[0] + x * (c[1] + x * (c[2] + x * (c[3] + x * c[4])));
  }
  static sim::SimulationConfig* config_;
  static const sim::SimulationTruth* truth_;
  static sar::test::WsInputs* x_;
  static scansar scan_;
  static wsparm par_;
  static std::array<RangeFocused, kSwaths> focused_;
  static std::array<CorrelationSums, kSwaths> sums_;
};
sim::SimulationConfig* BurstDoppler::config_ = nullptr;
const sim::SimulationTruth* BurstDoppler::truth_ = nullptr;
sar::test::WsInputs* BurstDoppler::x_ = nullptr;
scansar BurstDoppler::scan_;
wsparm BurstDoppler::par_;
std::array<RangeFocused, kSwaths> BurstDoppler::focused_;
std::array<CorrelationSums, kSwaths> BurstDoppler::sums_;

TEST_F(BurstDoppler, CentroidOfEverySubSwathWithItsAmbiguityOrTheOnesGiven) {
  ASSERT_NE(x_, nullptr);
  struct Row {
    const char* name;
    double predictionError;  // Hz
    bool geometricApplied;
  };
  for (const Row& row : {Row{"orbit 200 Hz off", 200.0, false}, Row{"orbit 300 Hz off the other way", -300.0, false},
                         Row{"orbit 1200 Hz off", 1200.0, true}}) {
    SCOPED_TRACE(row.name);
    DopplerEstimate est;
    ASSERT_EQ(burst_doppler(scan_, par_, x_->refs, focused_, sums_, est, prediction(row.predictionError)), 0);
    EXPECT_EQ(est.geometricApplied, row.geometricApplied);
    for (int s = 0; s < 5; ++s) {
      const sim::TargetTruth& tt = truth_->targets[static_cast<std::size_t>(sar::test::target_of_swath(s))];
      const double got = centroid_at(est, s, tt.range_time);
      RecordProperty(std::string("SS") + std::to_string(s + 1) + "_" + std::to_string(static_cast<int>(row.predictionError)),
                     std::to_string(got - tt.doppler_centroid));
      if (row.geometricApplied) {
        // The orbit's ambiguity: whole PRFs away from the truth, the fraction kept.
        const double off = (got - tt.doppler_centroid) / scan_.prf[static_cast<std::size_t>(s)];
        EXPECT_NEAR(off, std::round(off), 0.05) << "SS" << s + 1;
        EXPECT_NE(std::lround(off), 0) << "SS" << s + 1;
      } else {
        // Eight point targets a sub-swath sample the pattern coarsely: a few percent of a PRF.
        EXPECT_NEAR(got, tt.doppler_centroid, 0.04 * scan_.prf[static_cast<std::size_t>(s)]) << "SS" << s + 1;
      }
    }
    // The rate: -2 V^2 / (lambda R) of the orbit against the truth's zero-Doppler rate.
    for (int s = 0; s < 5; ++s) {
      const sim::TargetTruth& tt = truth_->targets[static_cast<std::size_t>(sar::test::target_of_swath(s))];
      const auto& r = est.rate[static_cast<std::size_t>(s)];
      const double x = tt.range_time - est.refTime;
      EXPECT_NEAR(r[0] + x * (r[1] + x * r[2]), tt.doppler_rate, 0.01 * std::abs(tt.doppler_rate)) << "SS" << s + 1;
    }
  }
  {
    // A given ambiguity reference is taken as it stands: one PRF of SS1 below the truth, the
    // data's fractions are kept, their ambiguity follows the reference and no warning is raised.
    wsparm par = par_;
    const sim::TargetTruth& first = truth_->targets[static_cast<std::size_t>(sar::test::target_of_swath(0))];
    par.centroidReference = first.doppler_centroid - scan_.prf[0];
    DopplerEstimate est;
    ASSERT_EQ(burst_doppler(scan_, par, x_->refs, focused_, sums_, est, prediction(0.0)), 0);
    EXPECT_FALSE(est.geometricApplied);
    EXPECT_NEAR(centroid_at(est, 0, first.range_time), first.doppler_centroid - scan_.prf[0], 0.04 * scan_.prf[0]);
  }
  {
    // A sub-swath of noise alone: correlations of random phase, as weak as noise leaves them.
    // It holds no centroid, and takes the orbit's.
    std::array<CorrelationSums, kSwaths> sums = sums_;
    CorrelationSums& noise = sums[1];
    std::mt19937 random(3);
    std::normal_distribution<double> g(0.0, 1.0);
    const double perColumn = std::sqrt(static_cast<double>(noise.pairs));
    for (std::size_t k = 0; k < noise.sum.size(); ++k) {
      noise.sum[k] = {g(random) * perColumn, g(random) * perColumn};
      noise.power[k] = static_cast<double>(noise.pairs);
    }
    DopplerEstimate est;
    ASSERT_EQ(burst_doppler(scan_, par_, x_->refs, focused_, sums, est, prediction(150.0)), 0);
    const sim::TargetTruth& tt = truth_->targets[static_cast<std::size_t>(sar::test::target_of_swath(1))];
    EXPECT_NEAR(centroid_at(est, 1, tt.range_time), tt.doppler_centroid + 150.0, 1.0);
    EXPECT_NEAR(centroid_at(est, 0, truth_->targets[1].range_time), truth_->targets[1].doppler_centroid,
                0.04 * scan_.prf[0]);
  }
}

// Doppler granules: the bursts each granule takes, and which granule a burst is focused with.
TEST(DopplerGranules, LayoutAlongTheScene) {
  struct Row {
    int32_t bursts, length;
    int32_t count;
    double referenceCycles, stepCycles;
    std::vector<int32_t> first;  // of the granules between the first and the last
  };
  const double c = 0.19;
  for (const Row& r : {Row{100, 20, 11, 0.0, 10.0, {0, 10, 20, 30, 40, 50, 60, 70, 80}},
                       // 45 = 2 x 20 + 5: the granules overlap by 8 bursts, 12 apart.
                       Row{45, 20, 5, -2.0, 12.0, {0, 12, 24}}, Row{60, 20, 7, 0.0, 10.0, {0, 10, 20, 30, 40}},
                       // Fewer than two granules' worth: one, the whole scene, at its middle.
                       Row{39, 20, 1, 19.5, 0.0, {}}, Row{7, 20, 1, 3.5, 0.0, {}}}) {
    SCOPED_TRACE(std::to_string(r.bursts) + " bursts, granules of " + std::to_string(r.length));
    const GranuleLayout g = granule_layout(r.bursts, r.length, c);
    ASSERT_EQ(g.count, r.count);
    EXPECT_NEAR(g.referenceTime, r.referenceCycles * c, 1e-12);
    EXPECT_NEAR(g.step, r.stepCycles * c, 1e-12);
    for (std::size_t k = 0; k < r.first.size(); ++k) {
      EXPECT_EQ(g.first[k + 1], r.first[k]);
      // The middle of the granule's bursts is its reference time.
      EXPECT_NEAR(g.referenceTime + static_cast<double>(k + 1) * g.step, (r.first[k] + 0.5 * r.length) * c, 1e-9);
    }
  }
  // A burst is focused with the granule centred nearest the granule-long run it starts.
  scansar scan;
  scan.cycleTime = c;
  scan.prf = {1686, 2058, 1656, 2064, 1670};
  scan.echoes = {50, 65, 55, 71, 60};
  scan.burstOffset = {0.0, 0.04, 0.08, 0.12, 0.16};
  const GranuleLayout g = granule_layout(100, 20, c);
  for (const auto& [b, expected] : std::vector<std::pair<int32_t, int32_t>>{{0, 1}, {19, 1}, {20, 3}, {57, 5}, {99, 9}})
    for (int s = 0; s < 5; ++s) EXPECT_EQ(granule_of_burst(g, scan, s, b), expected) << "burst " << b << " SS" << s + 1;
  EXPECT_EQ(granule_of_burst(granule_layout(39, 20, c), scan, 2, 30), 0);
}

// Granules of three bursts along the ten-burst product. Range focusing sums each granule's own
// bursts. The product's targets lie within one cycle along the track, too few for a granule's
// centroid of their own, so each granule is given the whole scene's sums turned by a Doppler of
// 40 k Hz (granule k), which its centroid must follow; a granule whose sums are empty inherits
// its predecessor's; the rate is the orbit's at each granule's time.
TEST_F(BurstDoppler, GranulesFollowTheirOwnBursts) {
  ASSERT_NE(x_, nullptr);
  wsparm par = par_;
  par.granuleLength = 3;
  std::array<RangeFocused, kSwaths> focused{};
  std::array<CorrelationSums, kSwaths> sums{};
  for (int s = 0; s < 5; ++s)
    ASSERT_EQ(burst_range_focus(x_->dir, s, x_->channels[static_cast<std::size_t>(s)], scan_, par, x_->refs.replica,
                                focused[static_cast<std::size_t>(s)], sums[static_cast<std::size_t>(s)]),
              0);
  const GranuleLayout layout = granule_layout(scan_.bursts, 3, scan_.cycleTime);
  ASSERT_EQ(layout.count, 7);
  const int32_t empty = 4;
  for (int s = 0; s < 5; ++s) {
    CorrelationSums& whole = sums[static_cast<std::size_t>(s)];
    auto& granules = whole.granules;
    ASSERT_EQ(static_cast<int32_t>(granules.size()), layout.count);
    for (int32_t k = 1; k + 1 < layout.count; ++k) {
      auto& g = granules[static_cast<std::size_t>(k)];
      const int32_t first = layout.first[static_cast<std::size_t>(k)];
      EXPECT_EQ(g.pairs, (std::min(first + 3, scan_.bursts) - first) * (scan_.echoes[static_cast<std::size_t>(s)] - 1));
      EXPECT_NE(g.sum, granules[static_cast<std::size_t>(k == 1 ? 2 : 1)].sum);  // bursts of its own
      const std::complex<double> turn = std::polar(1.0, 2.0 * 3.14159265358979 * 40.0 * k / scan_.prf[static_cast<std::size_t>(s)]);
      g.sum = whole.sum;
      g.power = whole.power;
      for (auto& v : g.sum) v = k == empty ? std::complex<double>{} : v * turn;
    }
  }
  DopplerEstimate est;
  ASSERT_EQ(burst_doppler(scan_, par, x_->refs, focused, sums, est, prediction(0.0)), 0);
  ASSERT_EQ(static_cast<int32_t>(est.granuleCentroid.size()), layout.count);
  EXPECT_NEAR(est.granuleStep, layout.step, 1e-12);
  for (int s = 0; s < 5; ++s) {
    const auto i = static_cast<std::size_t>(s);
    const double x = focused[i].nearTime + 0.5 * focused[i].width / scan_.samplingRate - est.refTime;
    auto at = [x](const std::array<double, 5>& c) { return c[0] + x * (c[1] + x * c[2]); };
    const double whole = at(est.centroid[i]);
    EXPECT_EQ(at(est.granuleCentroid[0][i]), whole);
    EXPECT_EQ(at(est.granuleCentroid[static_cast<std::size_t>(layout.count - 1)][i]), whole);
    for (int32_t k = 1; k + 1 < layout.count; ++k) {
      const double got = at(est.granuleCentroid[static_cast<std::size_t>(k)][i]);
      if (k == empty)
        EXPECT_EQ(got, at(est.granuleCentroid[static_cast<std::size_t>(k - 1)][i])) << "SS" << s + 1;
      else
        EXPECT_NEAR(got - whole, 40.0 * k, 0.5) << "SS" << s + 1 << " granule " << k;
      // The orbit's rate changes little along the scene: within a permille of the whole scene's.
      EXPECT_NEAR(at(est.granuleRate[static_cast<std::size_t>(k)][i]), at(est.rate[i]), 1e-3 * std::abs(at(est.rate[i])));
    }
  }
  // Written and read back whole.
  const std::string path = x_->dir + "/granules.par";
  ASSERT_EQ(save_doppler(path, est, focused), 0);
  DopplerEstimate back;
  std::array<RangeFocused, kSwaths> f{};
  ASSERT_EQ(load_doppler(path, back, f), 0);
  ASSERT_EQ(back.granuleCentroid.size(), est.granuleCentroid.size());
  for (std::size_t k = 0; k < 3; ++k) {
    EXPECT_NEAR(back.granuleCentroid[3][2][k], est.granuleCentroid[3][2][k], 1e-9 * std::abs(est.granuleCentroid[3][2][k]));
    EXPECT_NEAR(back.granuleRate[5][4][k], est.granuleRate[5][4][k], 1e-9 * std::abs(est.granuleRate[5][4][k]));
  }
  EXPECT_NEAR(back.granuleStep, est.granuleStep, 1e-12);
}

// ---------------------------------------------------------------------------------------------
// Resume and bad input on a small product.

class WsStagesRun : public ::testing::Test {
 protected:
  static void SetUpTestSuite() {
    config_ = new sim::SimulationConfig(sar::test::ws_product("stages", {0, 2, 4, 1, 3}, 4, 640));
    truth_ = &sar::test::simulated(*config_);
    x_ = new sar::test::WsInputs;
    sar::test::prepare(*truth_, config_->out_dir + "/run", *x_);
  }
  static void TearDownTestSuite() {
    delete x_;
    delete config_;
  }
  static sim::SimulationConfig* config_;
  static const sim::SimulationTruth* truth_;
  static sar::test::WsInputs* x_;
};
sim::SimulationConfig* WsStagesRun::config_ = nullptr;
const sim::SimulationTruth* WsStagesRun::truth_ = nullptr;
sar::test::WsInputs* WsStagesRun::x_ = nullptr;

TEST_F(WsStagesRun, RangeAndDopplerThenAzimuthInASecondRunGiveTheSameImages) {
  ASSERT_NE(x_, nullptr);
  const std::string one = x_->dir + "/one", two = x_->dir + "/two";
  std::filesystem::create_directories(one);
  std::filesystem::create_directories(two);
  wsparm par;
  ASSERT_EQ(WSprocessor(one, x_->channels, x_->refs, par, WsStages{}, false), 0);
  wsparm first;
  ASSERT_EQ(WSprocessor(two, x_->channels, x_->refs, first, WsStages{true, false, true}, false), 0);
  EXPECT_TRUE(std::filesystem::exists(two + "/doppler.par"));
  EXPECT_FALSE(std::filesystem::exists(two + "/SS1.out"));
  wsparm second;
  ASSERT_EQ(WSprocessor(two, x_->channels, x_->refs, second, WsStages{false, true, true}, false), 0);
  for (int s = 1; s <= 5; ++s) {
    const std::string name = "/SS" + std::to_string(s) + ".out";
    const std::vector<char> a = slurp(one + name), b = slurp(two + name);
    EXPECT_FALSE(a.empty()) << name;
    EXPECT_TRUE(a == b) << name;
    EXPECT_TRUE(std::filesystem::exists(two + name + ".hdr")) << name;
    EXPECT_FALSE(std::filesystem::exists(two + "/rgfoc_ss" + std::to_string(s))) << name;
  }
  // The header's image statistics are those of the samples written; its corners lie around the
  // sub-swath's target.
  for (int s = 1; s <= 5; ++s) {
    SCOPED_TRACE("SS" + std::to_string(s));
    const std::string hdr = one + "/SS" + std::to_string(s) + ".out.hdr";
    std::array<double, 1> samples{}, power{}, amplitude{};
    ASSERT_EQ(sar::base::GetProfileDoubleArray("Image", "Samples", samples, hdr), 0);
    ASSERT_EQ(sar::base::GetProfileDoubleArray("Statistics", "MeanPower", power, hdr), 0);
    ASSERT_EQ(sar::base::GetProfileDoubleArray("Statistics", "MeanAmplitude", amplitude, hdr), 0);
    const std::vector<char> bytes = slurp(one + "/SS" + std::to_string(s) + ".out");
    const std::size_t rec = 17 + 8 * static_cast<std::size_t>(samples[0]);
    double sum = 0.0, sumA = 0.0;
    long long count = 0;
    for (std::size_t l = 0; l + rec <= bytes.size(); l += rec)
      for (std::size_t k = 0; k < static_cast<std::size_t>(samples[0]); ++k) {
        std::complex<float> z;
        std::memcpy(&z, bytes.data() + l + 17 + 8 * k, 8);
        if (z == std::complex<float>{}) continue;
        sum += std::norm(z);
        sumA += std::abs(z);
        ++count;
      }
    ASSERT_GT(count, 0);
    EXPECT_NEAR(power[0], sum / count, 1e-6 * sum / count);
    EXPECT_NEAR(amplitude[0], sumA / count, 1e-6 * sumA / count);
    const auto& target = truth_->targets[static_cast<std::size_t>(sar::test::target_of_swath(s - 1))].target.position;
    std::array<double, 2> near{}, far{}, centre{};
    ASSERT_EQ(sar::base::GetProfileDoubleArray("Corners", "FirstNear", near, hdr), 0);
    ASSERT_EQ(sar::base::GetProfileDoubleArray("Corners", "LastFar", far, hdr), 0);
    ASSERT_EQ(sar::base::GetProfileDoubleArray("Corners", "Centre", centre, hdr), 0);
    // A few kilometres of swath and a second or two of track: within 0.2 degrees of the target.
    for (const auto& p : {near, far, centre}) {
      EXPECT_NEAR(p[0], target.lat_deg, 0.2);
      EXPECT_NEAR(p[1], target.lon_deg, 0.2);
    }
    EXPECT_NE(near, far);
  }
}

// Each burst is focused with its own granule's centroid: a granule moved by 100 Hz moves the
// output window of the bursts that use it, by the time that Doppler takes at the rate, and no
// other burst's.
TEST_F(WsStagesRun, EachBurstIsFocusedWithItsGranule) {
  ASSERT_NE(x_, nullptr);
  scansar scan;
  ASSERT_EQ(derive_geometry(x_->channels, scan), 0);
  wsparm par;
  par.granuleLength = 2;
  ASSERT_EQ(check_bursts(scan, par), 0);
  const int s = 2;
  const auto i = static_cast<std::size_t>(s);
  std::array<RangeFocused, kSwaths> focused{};
  std::array<CorrelationSums, kSwaths> sums{};
  par.swathsToProcess = {0, 0, 1, 0, 0};
  ASSERT_EQ(burst_range_focus(x_->dir, s, x_->channels[i], scan, par, x_->refs.replica, focused[i], sums[i]), 0);
  DopplerEstimate est;
  ASSERT_EQ(burst_doppler(scan, par, x_->refs, focused, sums, est), 0);
  const GranuleLayout layout = granule_layout(scan.bursts, 2, scan.cycleTime);
  ASSERT_EQ(layout.count, 5);
  auto first_lines = [&](const DopplerEstimate& e) {
    EXPECT_EQ(burst_azimuth_focus(x_->dir, s, scan, par, e, focused[i]), 0);
    const int width = focused[i].validColumns - par.rangeOverlap;
    const std::vector<char> bytes = slurp(x_->dir + "/SS3.out");
    const std::size_t rec = 17 + 8 * static_cast<std::size_t>(width), lines = static_cast<std::size_t>(par.linesPerBurst[i]);
    std::vector<int32_t> first;
    for (std::size_t b = 0; b < static_cast<std::size_t>(scan.bursts); ++b) {
      int32_t n = 0;
      decode_line_prefix(reinterpret_cast<const unsigned char*>(bytes.data()) + b * lines * rec, n);
      first.push_back(n);
    }
    return first;
  };
  const std::vector<int32_t> before = first_lines(est);
  const int32_t moved = granule_of_burst(layout, scan, s, 1);
  DopplerEstimate shifted = est;
  shifted.granuleCentroid[static_cast<std::size_t>(moved)][i][0] += 100.0;
  const std::vector<int32_t> after = first_lines(shifted);
  const double x = focused[i].nearTime + (focused[i].firstValid + par.rangeOverlap / 2 + (focused[i].validColumns - par.rangeOverlap) / 2) /
                                             scan.samplingRate - est.refTime;
  const auto& r = est.granuleRate[static_cast<std::size_t>(moved)][i];
  const double lines = -100.0 / (r[0] + x * (r[1] + x * r[2])) / par.azimuthStep;
  for (int32_t b = 0; b < scan.bursts; ++b) {
    if (granule_of_burst(layout, scan, s, b) == moved)
      EXPECT_NEAR(after[static_cast<std::size_t>(b)] - before[static_cast<std::size_t>(b)], lines, 1.0) << "burst " << b;
    else
      EXPECT_EQ(after[static_cast<std::size_t>(b)], before[static_cast<std::size_t>(b)]) << "burst " << b;
  }
}

TEST_F(WsStagesRun, BadInputGivesItsStatusAndLeavesNoProduct) {
  ASSERT_NE(x_, nullptr);
  struct Row {
    const char* name;
    std::function<void(std::vector<sar::envisat::sarpar>&, wsparm&, WsStages&)> spoil;
    int status;
  };
  const std::vector<Row> rows = {
      {"first burst 0", [](auto&, wsparm& p, WsStages&) { p.firstBurst = 0; }, 1},
      {"last burst past the product", [](auto&, wsparm& p, WsStages&) { p.lastBurst = 99; }, 1},
      {"first after last", [](auto&, wsparm& p, WsStages&) { p.firstBurst = 3, p.lastBurst = 2; }, 1},
      {"four sub-swaths", [](auto& c, wsparm&, WsStages&) { c.pop_back(); }, 10},
      {"firing order names a sub-swath twice", [](auto& c, wsparm&, WsStages&) { c[1].ss_order = c[0].ss_order; }, 10},
      {"sub-swaths of different burst counts", [](auto& c, wsparm&, WsStages&) { c[2].burst_count += 1; }, 10},
      {"bursts the line file does not hold", [](auto& c, wsparm&, WsStages&) { for (auto& p : c) p.burst_count += 1; }, 10},
      {"no PRF", [](auto& c, wsparm&, WsStages&) { c[3].prf = 0.0; }, 10},
      {"resume without the Doppler file", [](auto&, wsparm&, WsStages& st) { st.rangeDoppler = false; }, 1},
  };
  for (const Row& row : rows) {
    SCOPED_TRACE(row.name);
    const std::string dir = x_->dir + "/bad";
    std::filesystem::remove_all(dir);
    std::filesystem::create_directories(dir);
    std::vector<sar::envisat::sarpar> channels = x_->channels;
    wsparm par;
    WsStages stages;
    row.spoil(channels, par, stages);
    EXPECT_EQ(WSprocessor(dir, channels, x_->refs, par, stages, false), row.status);
    for (int s = 1; s <= 5; ++s) EXPECT_FALSE(std::filesystem::exists(dir + "/SS" + std::to_string(s) + ".out"));
  }
  // A line file that is gone: the file I/O code naming it.
  std::vector<sar::envisat::sarpar> channels = x_->channels;
  channels[4].raw_file = x_->dir + "/no_such_file";
  wsparm par;
  try {
    WSprocessor(x_->dir + "/bad", channels, x_->refs, par, WsStages{}, false);
    ADD_FAILURE() << "no error raised";
  } catch (const sar::base::CErrorExceptionManager& e) {
    EXPECT_EQ(e.ec(), sar::base::ec::kFileIo);
    EXPECT_EQ(e.detail(), channels[4].raw_file);
  }
}

}  // namespace

namespace {

// The sub-swaths' beam slots in the instrument tables: the pattern's reference look angle of
// each slot in the real ASA_INS against the look angle of the sub-swath's mid-swath incidence
// (a sphere of the Earth's mean radius, the platform 782 km above it).
TEST(BeamSlots, PatternLookAnglesMatchTheSubSwathsIncidences) {
  const sar::envisat::InsRecord ins = sar::envisat::InsRecord::read(sar::test::kInsTemplate);
  constexpr double kDeg = 3.14159265358979323846 / 180.0;
  const double re = 6371000.0, rs = re + 782000.0;
  for (int s = 0; s < kSwaths; ++s) {
    const double look = std::asin(re / rs * std::sin(kLookIncidence[static_cast<std::size_t>(s)] * kDeg)) / kDeg;
    const double table = ins.pattern_reference_angle(kBeamSlot[static_cast<std::size_t>(s)]);
    RecordProperty("SS" + std::to_string(s + 1), std::to_string(table) + " / " + std::to_string(look));
    EXPECT_NEAR(table, look, 0.3) << "SS" << s + 1;
    // The raw beam code of the sub-swath names no pattern at all.
    EXPECT_EQ(ins.pattern_reference_angle(15 + s), 0.0f) << "SS" << s + 1;
  }
}

}  // namespace

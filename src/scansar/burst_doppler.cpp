// Doppler centroid and rate of the bursts.
//
// Centroid. The correlation of adjacent echoes, summed over every burst, gives per column the
// centroid within one PRF: f = PRF arg(C) / 2 pi. Blocks of columns are averaged, their phases
// unwrapped against the sub-swath's mean and a line is fitted across range. The sub-swaths fire
// at different PRFs, so a centroid that is right in one and off by whole PRFs is wrong in the
// others: the absolute centroid is the candidate that fits every sub-swath's fraction best
// (the orbit's shape of the centroid across the sub-swaths carried along). The orbit's own
// centroid is the cross-check: when the data's answer lies more than half a PRF from it, the
// data are not trusted ("Wrong Ambiguity", a warning) and the orbit's ambiguity is applied.
//
// Rate and geometry come from the orbit: one reference range time (the near range of SS1) for
// every polynomial, so that sub-swaths can be evaluated on one axis.
#include <algorithm>
#include <cmath>
#include <limits>
#include <string>
#include <vector>

#include "base/diagnostics.hpp"
#include "base/profile.hpp"
#include "base/run_services.hpp"
#include "scansar/wide_swath.hpp"
#include "stripmap/geopoly.hpp"
#include "base/constants.hpp"

namespace sar::scansar {
namespace {
constexpr int kRejected = 10;
using base::kPi;
constexpr double kC = base::kSpeedOfLight;
constexpr int kColumnBlock = 32;
constexpr int kAmbiguitySpan = 10;
constexpr std::size_t kSlopeBlocks = 8;
constexpr double kNoiseSigmas = 5.0;

double wrap(double x, double period) { return x - period * std::floor(x / period + 0.5); }


// Fractional centroid of a sub-swath: constant and slope in range time about refTime.
bool fractional_centroid(const CorrelationSums& sums, const RangeFocused& f, double prf, double fs, double refTime,
                         double& c0, double& c1) {
  if (sums.pairs <= 0 || sums.sum.empty()) return false;
  const int32_t first = f.firstValid, count = f.validColumns;
  std::complex<double> total{};
  double power = 0.0;
  for (int32_t k = first; k < first + count; ++k) {
    total += sums.sum[static_cast<std::size_t>(k)];
    if (static_cast<std::size_t>(k) < sums.power.size()) power += sums.power[static_cast<std::size_t>(k)];
  }
  if (std::abs(total) <= 2.220446e-16) return false;
  // Noise alone leaves a correlation coefficient of about 1 / sqrt(samples): a sub-swath whose
  // echoes correlate no better than five times that holds no centroid to read.
  const double samples = static_cast<double>(sums.pairs) * count;
  if (power > 0.0 && std::abs(total) / power < kNoiseSigmas / std::sqrt(samples)) return false;
  const double mean = std::arg(total);
  std::vector<double> x, y;
  for (int32_t k = first; k + kColumnBlock <= first + count; k += kColumnBlock) {
    std::complex<double> c{};
    for (int32_t j = k; j < k + kColumnBlock; ++j) c += sums.sum[static_cast<std::size_t>(j)];
    if (std::abs(c) <= 2.220446e-16) continue;
    x.push_back(f.nearTime + (k + kColumnBlock / 2.0) / fs - refTime);
    y.push_back((mean + wrap(std::arg(c) - mean, 2.0 * kPi)) * prf / (2.0 * kPi));
  }
  c1 = 0.0;
  c0 = mean * prf / (2.0 * kPi) - c1 * (f.nearTime + count / 2.0 / fs - refTime);
  // A slope needs a swath wide enough to hold it; a narrow one keeps its mean.
  if (x.size() >= kSlopeBlocks) {
    std::array<double, 2> c{};
    if (stripmap::polfit(x, y, c, 1) == 0) {
      c0 = c[0];
      c1 = c[1];
    }
  }
  return true;
}

// The orbit's Doppler rate and incidence across a sub-swath, fitted about refTime.
int orbit_geometry(const scansar& scan, int s, const metadata::SceneReferences& refs, const RangeFocused& f,
                   double centroidMid, double refTime, double tCentre, DopplerEstimate& est) {
  const auto i = static_cast<std::size_t>(s);
  metadata::sarpar p;
  p.prf = scan.prf[i];
  p.samplingRate = scan.samplingRate;
  p.carrierFrequency = scan.carrierFrequency;
  p.nearRangeTime = f.nearTime;
  p.samples = std::max(f.width, 16);
  p.lines = std::max(1, static_cast<int>(std::lround(scan.bursts * scan.cycleTime * scan.prf[i])));
  p.azimuthStartTime = tCentre - 0.5 * p.lines / p.prf;
  stripmap::procparm proc;
  static_cast<metadata::SceneReferences&>(proc) = refs;
  proc.dopplerCentroid = {centroidMid, 0, 0, 0, 0, 0, 0, f.nearTime, 0};
  if (const int st = stripmap::getgeopoly(p, proc); st != 0) return st;
  constexpr int kPoints = 10;
  std::vector<double> x(kPoints), rate(kPoints), inc(kPoints), ground(kPoints), look(kPoints);
  double g = 0.0;
  for (int k = 0; k < kPoints; ++k) {
    const double tau = f.nearTime + k * (p.samples - 1.0) / (kPoints - 1) / scan.samplingRate;
    x[static_cast<std::size_t>(k)] = tau - refTime;
    rate[static_cast<std::size_t>(k)] = stripmap::DCeval(proc.dopplerRate, tau, 0.0);
    inc[static_cast<std::size_t>(k)] = stripmap::DCeval(proc.incidenceAngle, tau, 0.0);
    look[static_cast<std::size_t>(k)] = stripmap::DCeval(proc.lookAngle, tau, 0.0) * kPi / 180.0;
    if (k > 0) {
      const double sinMid = std::sin(0.5 * (inc[static_cast<std::size_t>(k)] + inc[static_cast<std::size_t>(k - 1)]) * kPi / 180.0);
      g += (kC / 2.0) * (x[static_cast<std::size_t>(k)] - x[static_cast<std::size_t>(k - 1)]) / sinMid;
    }
    ground[static_cast<std::size_t>(k)] = g;
  }
  std::array<double, 3> r{};
  if (const int st = stripmap::polfit(x, rate, r, 2); st != 0) return st;
  est.rate[i] = {r[0], r[1], r[2], 0.0, 0.0};
  est.incidence[i] = stripmap::DCeval(proc.incidenceAngle, f.nearTime + 0.5 * p.samples / scan.samplingRate, 0.0);
  std::vector<double> xs(kPoints);
  for (int k = 0; k < kPoints; ++k) xs[static_cast<std::size_t>(k)] = x[static_cast<std::size_t>(k)] - (f.nearTime - refTime);
  std::array<double, 4> gr{};
  if (const int st = stripmap::polfit(xs, ground, gr, 3); st != 0) return st;
  est.slantToGround[i] = {gr[0], gr[1], gr[2], gr[3], 0.0};
  // The look angle, degree 4, fitted in tenths of a millisecond so that the normal equations
  // stay well conditioned, then scaled back to seconds.
  constexpr double kUnit = 1e4;
  std::vector<double> xu(kPoints);
  for (int k = 0; k < kPoints; ++k) xu[static_cast<std::size_t>(k)] = xs[static_cast<std::size_t>(k)] * kUnit;
  std::array<double, 5> el{};
  if (const int st = stripmap::polfit(xu, look, el, 4); st != 0) return st;
  double scale = 1.0;
  for (std::size_t k = 0; k < el.size(); ++k, scale *= kUnit) est.slantToElevation[i][k] = el[k] * scale;
  return 0;
}

}  // namespace

double zero_doppler_centroid(const metadata::SceneReferences&, double, double, double) { return 0.0; }

int burst_doppler(const scansar& scan, const wsparm& par, const metadata::SceneReferences& refs,
                  std::span<const RangeFocused> focused, std::span<const CorrelationSums> sums, DopplerEstimate& est,
                  const GeometricCentroid& geometric) {
  base::Frame frame("burst_doppler");
  est = DopplerEstimate{};
  est.refTime = scan.nearTime[0];
  const double lambda = kC / scan.carrierFrequency;
  const double tMid = scan.firstLineTime + 0.5 * scan.bursts * scan.cycleTime;
  const auto& v = refs.orbitVelocities;
  est.satelliteSpeed = std::sqrt(v[6] * v[6] + v[7] * v[7] + v[8] * v[8]);
  if (!(est.satelliteSpeed > 0.0)) {
    base::report(base::kReportError, "Burst Doppler: the orbit gives no velocity");
    return frame.check(kRejected);
  }
  std::array<double, kSwaths> frac0{}, frac1{}, mid{};
  std::array<bool, kSwaths> have{};
  int reference = -1;
  for (int s = 0; s < kSwaths; ++s) {
    const auto i = static_cast<std::size_t>(s);
    if (!par.swathsToProcess[i] || i >= focused.size()) continue;
    mid[i] = focused[i].nearTime + 0.5 * focused[i].width / scan.samplingRate;
    est.geometric[i] = geometric(refs, tMid, mid[i], lambda);
    have[i] = i < sums.size() && fractional_centroid(sums[i], focused[i], scan.prf[i], scan.samplingRate, est.refTime,
                                                     frac0[i], frac1[i]);
    if (have[i]) {
      est.fractional[i] = wrap(frac0[i] + frac1[i] * (mid[i] - est.refTime), scan.prf[i]);
      if (reference < 0) reference = s;
    }
  }
  // The absolute centroid of the reference sub-swath that fits every sub-swath's fraction.
  double best = std::numeric_limits<double>::max(), second = best;
  double chosen = 0.0;
  if (reference >= 0) {
    const auto r = static_cast<std::size_t>(reference);
    const double base = par.centroidReference >= -1e9 ? par.centroidReference : est.geometric[r];
    const int span = par.centroidReference >= -1e9 ? 0 : kAmbiguitySpan;
    const double k0 = std::round((base - est.fractional[r]) / scan.prf[r]);
    for (int k = -span; k <= span; ++k) {
      const double F = est.fractional[r] + (k0 + k) * scan.prf[r];
      double err = 0.0;
      for (std::size_t i = 0; i < kSwaths; ++i) {
        if (!have[i]) continue;
        const double e = wrap(F + est.geometric[i] - est.geometric[r] - est.fractional[i], scan.prf[i]);
        err += e * e;
      }
      if (err < best) {
        second = best;
        best = err;
        chosen = F;
      } else if (err < second) {
        second = err;
      }
    }
    est.ambiguityDoubtful = span > 0 && second < best * 1.25 + 1.0;
    if (est.ambiguityDoubtful) base::report(base::kReportWarning, "prf ambiguity resolution doubtful!");
    if (std::abs(chosen - est.geometric[r]) > 0.5 * scan.prf[r] && par.centroidReference < -1e9) {
      base::report(base::kReportWarning, "Wrong Ambiguity: the data's centroid lies more than half a PRF from the "
                                         "orbit's; the orbit's ambiguity is applied");
      est.geometricApplied = true;
      chosen = est.fractional[r] + std::round((est.geometric[r] - est.fractional[r]) / scan.prf[r]) * scan.prf[r];
    }
  }
  for (int s = 0; s < kSwaths; ++s) {
    const auto i = static_cast<std::size_t>(s);
    if (!par.swathsToProcess[i] || i >= focused.size()) continue;
    if (have[i]) {
      const double target = chosen + est.geometric[i] - est.geometric[static_cast<std::size_t>(reference)];
      est.ambiguity[i] = static_cast<int32_t>(std::lround((target - est.fractional[i]) / scan.prf[i]));
      const double shift = est.fractional[i] + est.ambiguity[i] * scan.prf[i] -
                           (frac0[i] + frac1[i] * (mid[i] - est.refTime));
      est.centroid[i] = {frac0[i] + shift, frac1[i], 0.0, 0.0, 0.0};
    } else {
      est.centroid[i] = {est.geometric[i], 0.0, 0.0, 0.0, 0.0};
    }
    if (const int st = orbit_geometry(scan, s, refs, focused[i], poly4(est.centroid[i], mid[i] - est.refTime),
                                      est.refTime, tMid, est);
        st != 0) {
      base::report(base::kReportError, "Burst Doppler: no rate from the orbit for SS" + std::to_string(s + 1));
      return frame.check(st);
    }
    base::LogPrintf("SS%d: centroid %.2f Hz (fraction %.2f Hz, ambiguity %d, orbit %.2f Hz), rate %.2f Hz/s\n", s + 1,
                    poly4(est.centroid[i], mid[i] - est.refTime), est.fractional[i], est.ambiguity[i], est.geometric[i],
                    poly4(est.rate[i], mid[i] - est.refTime));
  }

  // Granules along the scene: each sub-swath's centroid from the granule's bursts alone, its
  // ambiguity the one nearest the whole scene's; the rate from the orbit at the granule's time.
  const GranuleLayout layout = granule_layout(scan.bursts, par.granuleLength, scan.cycleTime);
  est.granuleReference = layout.referenceTime;
  est.granuleStep = layout.step;
  est.granuleCentroid.assign(static_cast<std::size_t>(layout.count), est.centroid);
  est.granuleRate.assign(static_cast<std::size_t>(layout.count), est.rate);
  for (int32_t k = 1; k + 1 < layout.count; ++k) {
    const auto g = static_cast<std::size_t>(k);
    // An odd granule length lays the last granules past the scene's end; their rate is the
    // orbit's at the end.
    const double tk = scan.firstLineTime + std::clamp(layout.referenceTime + k * layout.step, 0.0, scan.bursts * scan.cycleTime);
    for (int s = 0; s < kSwaths; ++s) {
      const auto i = static_cast<std::size_t>(s);
      if (!par.swathsToProcess[i] || i >= focused.size()) continue;
      auto& c = est.granuleCentroid[g][i];
      c = est.granuleCentroid[g - 1][i];  // a granule that gives no centroid inherits its predecessor's
      const double m = mid[i] - est.refTime;
      double f0 = 0.0, f1 = 0.0;
      if (i < sums.size() && g < sums[i].granules.size() &&
          fractional_centroid(sums[i].granules[g], focused[i], scan.prf[i], scan.samplingRate, est.refTime, f0, f1)) {
        const double whole = poly4(est.centroid[i], m);
        const double shift = std::round((whole - (f0 + f1 * m)) / scan.prf[i]) * scan.prf[i];
        if (std::abs(f0 + shift + f1 * m - whole) <= 0.5 * scan.prf[i]) c = {f0 + shift, f1, 0.0, 0.0, 0.0};
      }
      DopplerEstimate at;
      if (const int st = orbit_geometry(scan, s, refs, focused[i], poly4(c, m), est.refTime, tk, at); st != 0) {
        base::report(base::kReportError, "Burst Doppler: no rate from the orbit for SS" + std::to_string(s + 1));
        return frame.check(st);
      }
      est.granuleRate[g][i] = at.rate[i];
    }
  }
  if (layout.count > 1)
    base::LogPrintf("Doppler granules: %d, %.3f s apart\n", layout.count, layout.step);
  return 0;
}

GranuleLayout granule_layout(int32_t bursts, int32_t length, double cycleTime) {
  GranuleLayout g;
  const int32_t G = std::max(1, length);
  g.length = G;
  const int32_t whole = bursts / G;
  if (whole * 2 - 1 < 2) {
    g.count = 1;
    g.step = 0.0;
    g.referenceTime = bursts * cycleTime * 0.5;
    g.first = {0};
    return g;
  }
  g.count = whole * 2 + 1;
  const int32_t overlap = G / 2 - (bursts - whole * G) / (whole * 2 - 2);
  g.step = (G - overlap) * cycleTime;
  g.referenceTime = G * cycleTime * 0.5 - g.step;
  g.first.assign(static_cast<std::size_t>(g.count), 0);
  for (int32_t k = 1; k + 1 < g.count; ++k) g.first[static_cast<std::size_t>(k)] = (G - overlap) * (k - 1);
  return g;
}

int32_t granule_of_burst(const GranuleLayout& g, const scansar& scan, int s, int32_t b) {
  if (g.count <= 1 || !(g.step > 0.0)) return 0;
  const auto i = static_cast<std::size_t>(s);
  const int32_t b0 = (b / g.length) * g.length;
  const double t = (g.length / 2 + b0) * scan.cycleTime + (scan.echoes[i] - 1) / (2.0 * scan.prf[i]) + scan.burstOffset[i];
  const auto k = static_cast<int32_t>(std::lround((t - g.referenceTime) / g.step));
  return std::clamp(k, 0, g.count - 1);
}

void CorrelationSums::add(const CorrelationSums& burst) {
  if (sum.size() < burst.sum.size()) sum.resize(burst.sum.size());
  if (power.size() < burst.power.size()) power.resize(burst.power.size());
  for (std::size_t k = 0; k < burst.sum.size(); ++k) sum[k] += burst.sum[k];
  for (std::size_t k = 0; k < burst.power.size(); ++k) power[k] += burst.power[k];
  pairs += burst.pairs;
}

namespace {
const char* kCentroidSection = "doppler_centroid";
const char* kRateSection = "doppler_rate";
std::string key(const char* stem, int s) { return std::string(stem) + std::to_string(s); }
}  // namespace

int save_doppler(const std::string& path, const DopplerEstimate& est, std::span<const RangeFocused> focused) {
  using namespace base;
  std::remove(path.c_str());
  WriteMyProfileDouble(kCentroidSection, "DC_reference_rg._time", est.refTime, path);
  WriteMyProfileDouble(kCentroidSection, "Satellite_speed", est.satelliteSpeed, path);
  WriteMyProfileInt(kCentroidSection, "Geometric_applied", est.geometricApplied ? 1 : 0, path);
  // Granule g's polynomials under coefs<g>_<s>; granule 0 is the whole scene. Times in seconds
  // from the scene's first line.
  const std::size_t granules = std::max<std::size_t>(1, est.granuleCentroid.size());
  WriteMyProfileInt(kCentroidSection, "No._Doppler_estimates", static_cast<int32_t>(granules), path);
  WriteMyProfileDouble(kCentroidSection, "DC_reference_az._time", est.granuleReference, path);
  WriteMyProfileDouble(kCentroidSection, "DC_az._time_step", est.granuleStep, path);
  WriteMyProfileInt(kRateSection, "No._rate_estimates", static_cast<int32_t>(granules), path);
  for (std::size_t g = 1; g < est.granuleCentroid.size() && g < est.granuleRate.size(); ++g)
    for (int s = 0; s < kSwaths; ++s) {
      const std::string gs = std::to_string(g) + "_" + std::to_string(s);
      WriteProfileDoubleArray(kCentroidSection, "Doppler_cent_coefs" + gs, est.granuleCentroid[g][static_cast<std::size_t>(s)], path);
      WriteProfileDoubleArray(kRateSection, "Doppler_rate_coefs" + gs, est.granuleRate[g][static_cast<std::size_t>(s)], path);
    }
  for (int s = 0; s < kSwaths && s < static_cast<int>(focused.size()); ++s) {
    const auto i = static_cast<std::size_t>(s);
    WriteProfileDoubleArray(kCentroidSection, key("Doppler_cent_coefs0_", s), est.centroid[i], path);
    WriteMyProfileInt(kCentroidSection, key("Ambiguity_", s), est.ambiguity[i], path);
    WriteMyProfileDouble(kCentroidSection, key("Fraction_", s), est.fractional[i], path);
    WriteProfileDoubleArray(kRateSection, key("Doppler_rate_coefs0_", s), est.rate[i], path);
    WriteProfileDoubleArray(kRateSection, key("Slant_to_ground_", s), est.slantToGround[i], path);
    WriteProfileDoubleArray(kRateSection, key("Slant_to_elevangle_", s), est.slantToElevation[i], path);
    WriteMyProfileDouble(kRateSection, key("Incidence_", s), est.incidence[i], path);
    const std::array<int32_t, 3> cols{focused[i].width, focused[i].firstValid, focused[i].validColumns};
    WriteMyProfileIntArray(kRateSection, key("Range_columns_", s), cols, path);
    WriteMyProfileDouble(kRateSection, key("Near_time_", s), focused[i].nearTime, path);
  }
  WriteMyProfileDouble(kRateSection, "Rate_ref_time", est.refTime, path);
  return SyncProfile(path) == 0 ? 0 : 1;
}

int load_doppler(const std::string& path, DopplerEstimate& est, std::array<RangeFocused, kSwaths>& focused) {
  using namespace base;
  est = DopplerEstimate{};
  int bad = 0;
  std::array<double, 1> one{};
  auto d = [&](const char* section, const std::string& k, double& out) {
    if (GetProfileDoubleArray(section, k, one, path) != 0) ++bad;
    out = one[0];
  };
  d(kCentroidSection, "DC_reference_rg._time", est.refTime);
  d(kCentroidSection, "Satellite_speed", est.satelliteSpeed);
  for (int s = 0; s < kSwaths; ++s) {
    const auto i = static_cast<std::size_t>(s);
    if (GetProfileDoubleArray(kCentroidSection, key("Doppler_cent_coefs0_", s), est.centroid[i], path) != 0) ++bad;
    if (GetProfileDoubleArray(kRateSection, key("Doppler_rate_coefs0_", s), est.rate[i], path) != 0) ++bad;
    if (GetProfileDoubleArray(kRateSection, key("Slant_to_ground_", s), est.slantToGround[i], path) != 0) ++bad;
    if (GetProfileDoubleArray(kRateSection, key("Slant_to_elevangle_", s), est.slantToElevation[i], path) != 0) ++bad;
    d(kRateSection, key("Incidence_", s), est.incidence[i]);
    d(kRateSection, key("Near_time_", s), focused[i].nearTime);
    std::array<int32_t, 3> cols{};
    if (GetMyProfileIntArray(kRateSection, key("Range_columns_", s), cols, path) != 0) ++bad;
    focused[i].width = cols[0];
    focused[i].firstValid = cols[1];
    focused[i].validColumns = cols[2];
  }
  std::array<int32_t, 1> count{1};
  if (GetMyProfileIntArray(kCentroidSection, "No._Doppler_estimates", count, path) != 0) ++bad;
  d(kCentroidSection, "DC_reference_az._time", est.granuleReference);
  d(kCentroidSection, "DC_az._time_step", est.granuleStep);
  if (count[0] < 1 || count[0] > 100000) ++bad;
  const auto granules = static_cast<std::size_t>(std::clamp(count[0], 1, 100000));
  est.granuleCentroid.assign(granules, est.centroid);
  est.granuleRate.assign(granules, est.rate);
  for (std::size_t g = 1; g < granules; ++g)
    for (int s = 0; s < kSwaths; ++s) {
      const std::string gs = std::to_string(g) + "_" + std::to_string(s);
      if (GetProfileDoubleArray(kCentroidSection, "Doppler_cent_coefs" + gs, est.granuleCentroid[g][static_cast<std::size_t>(s)], path) != 0) ++bad;
      if (GetProfileDoubleArray(kRateSection, "Doppler_rate_coefs" + gs, est.granuleRate[g][static_cast<std::size_t>(s)], path) != 0) ++bad;
    }
  FreeProfile(path);
  if (bad != 0) {
    base::report(base::kReportError, "Doppler estimates incomplete in " + path);
    return 1;
  }
  return 0;
}

}  // namespace sar::scansar

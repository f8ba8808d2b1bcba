#include "stripmap/geopoly.hpp"

#include <algorithm>
#include <cmath>
#include <cstddef>
#include <vector>

#include "base/diagnostics.hpp"
#include "dsp/fitting.hpp"
#include "geometry/geolocation.hpp"
#include "base/constants.hpp"

namespace sar::stripmap {

namespace {

constexpr int kRejected = 10;
using base::kSpeedOfLight;
constexpr int kRateDegree = 2;
constexpr int kAngleDegree = 4;

std::size_t at(int i) { return static_cast<std::size_t>(i); }

}  // namespace

int polfit(std::span<const double> x, std::span<const double> y, std::span<double> coefficients, int degree) {
  if (degree < 0 || x.size() != y.size() || coefficients.size() != at(degree + 1) || x.size() < at(degree + 1)) {
    return kRejected;
  }
  std::fill(coefficients.begin(), coefficients.end(), 0.0);
  const std::vector<double> sig(x.size(), 1.0);
  const std::vector<int> mask(coefficients.size(), 1);
  dsp::RowMatrixXd covar;
  double chisq = 0.0;
  const auto powers = [](double v, std::span<double> f) {
    double p = 1.0;
    for (double& term : f) {
      term = p;
      p *= v;
    }
  };
  return dsp::lfitdOBX(x, y, sig, coefficients, mask, covar, chisq, powers);
}

int get_geo_grid(double azStart, double rgStart, int nAz, int nRg, double azStep, double rgStep,
                 std::span<double> rateGrid, std::span<double> incidenceGrid, std::span<double> lookGrid,
                 const std::array<geometry::Vec3, 5>& stateVectors, double t0, double dt, double carrierFrequency,
                 const DopplerPoly& dopplerCentroid) {
  base::Frame frame("get_geo_grid");
  if (nAz < 1 || nRg < 1 || !(carrierFrequency > 0.0) || !(dt > 0.0)) return kRejected;
  const auto cells = static_cast<std::size_t>(nAz) * static_cast<std::size_t>(nRg);
  if (rateGrid.size() < cells || incidenceGrid.size() < cells || lookGrid.size() < cells) return kRejected;

  geometry::grpt_rec rec;
  rec.state_vectors = stateVectors;
  rec.t0 = t0;
  rec.dt = dt;
  rec.wavelength = kSpeedOfLight / carrierFrequency;
  rec.side = 1.0;
  rec.height = 0.0;
  for (int i = 0; i < nAz; ++i) {
    const double azimuthTime = azStart + i * azStep;
    for (int j = 0; j < nRg; ++j) {
      const double tau = rgStart + j * rgStep;
      rec.azimuth_time = azimuthTime;
      rec.tau = tau;
      rec.fdc = DCeval(dopplerCentroid, tau, azimuthTime);
      if (int st = frame.check(geometry::gr_pt_lat_lon(rec, geometry::kWgs84A, geometry::kWgs84B))) return st;
      const std::size_t k = static_cast<std::size_t>(i) * static_cast<std::size_t>(nRg) + static_cast<std::size_t>(j);
      rateGrid[k] = rec.doppler_rate;
      incidenceGrid[k] = rec.incidence;
      lookGrid[k] = rec.look;
    }
  }
  return 0;
}

int get_poly(double /*azStart*/, double rgStart, int nAz, int nRg, double /*azStep*/, double rgStep,
             std::span<const double> grid, DopplerPoly& slot, int degree) {
  base::Frame frame("get_poly");
  if (nAz < 1 || nRg < 1 || degree < 1 || degree > 4 || nRg < degree + 1) return kRejected;
  const int row = nAz / 2;
  const std::size_t first = static_cast<std::size_t>(row) * static_cast<std::size_t>(nRg);
  if (grid.size() < first + static_cast<std::size_t>(nRg)) return kRejected;

  std::vector<double> x(at(nRg));
  for (int j = 0; j < nRg; ++j) x[at(j)] = j * rgStep;
  std::vector<double> c(at(degree + 1), 0.0);
  if (int st = frame.check(polfit(x, grid.subspan(first, at(nRg)), c, degree))) return st;

  slot.fill(0.0);
  c.resize(5, 0.0);
  slot[0] = c[0];
  slot[1] = c[1];
  slot[4] = c[2];
  slot[5] = c[3];
  slot[6] = c[4];
  slot[7] = rgStart;
  slot[8] = 0.0;
  return 0;
}

int getgeopoly(const metadata::sarpar& par, procparm& proc) {
  base::Frame frame("getgeopoly");
  if (!(par.prf > 0.0) || !(par.samplingRate > 0.0) || par.lines < 1 || par.samples < 1 ||
      !(par.carrierFrequency > 0.0) || !(proc.orbitSpacing > 0.0)) {
    return kRejected;
  }
  const double duration = par.lines / par.prf;
  const double centreTime = par.azimuthStartTime + duration * 0.5;
  const double rgStep = (par.samples / par.samplingRate) * kGeoPolyRangeShare;

  std::array<geometry::Vec3, 5> vectors{};
  for (std::size_t k = 0; k < vectors.size(); ++k) {
    vectors[k] = {proc.orbitPositions[3 * k], proc.orbitPositions[3 * k + 1], proc.orbitPositions[3 * k + 2]};
  }

  constexpr int nAz = 1;
  constexpr int nRg = kGeoPolyRangePoints;
  std::array<double, nRg> rate{};
  std::array<double, nRg> incidence{};
  std::array<double, nRg> look{};
  if (int st = frame.check(get_geo_grid(centreTime, par.nearRangeTime, nAz, nRg, duration, rgStep, rate, incidence,
                                        look, vectors, proc.orbitStartTime, proc.orbitSpacing, par.carrierFrequency,
                                        proc.dopplerCentroid)))
    return st;
  if (int st = frame.check(
          get_poly(centreTime, par.nearRangeTime, nAz, nRg, duration, rgStep, rate, proc.dopplerRate, kRateDegree)))
    return st;
  if (int st = frame.check(
          get_poly(centreTime, par.nearRangeTime, nAz, nRg, duration, rgStep, look, proc.lookAngle, kAngleDegree)))
    return st;
  if (int st = frame.check(get_poly(centreTime, par.nearRangeTime, nAz, nRg, duration, rgStep, incidence,
                                    proc.incidenceAngle, kAngleDegree)))
    return st;
  return 0;
}

}  // namespace sar::stripmap

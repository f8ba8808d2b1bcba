#pragma once
// Geometry polynomials of a stripmap scene: Doppler rate, look angle and incidence angle as
// polynomials in two-way slant time at the scene's centre line.
//
// Each polynomial goes into a nine-word slot of the Doppler polynomial layout (see DCeval):
// constant in entry 0, first power in 1, second to fourth powers in 4, 5, 6, entries 2 and 3
// zero, the reference slant time (the near range) in entry 7 and 0 in entry 8, so that
// DCeval(slot, tau, any time) evaluates it. Angles are in degrees, the rate in Hz/s.
#include <array>
#include <span>

#include "metadata/acquisition.hpp"
#include "geometry/vec3.hpp"
#include "stripmap/procparm.hpp"

namespace sar::stripmap {

/// Points across the swath of the fits, and the share of the swath between two of them.
inline constexpr int kGeoPolyRangePoints = 10;
inline constexpr double kGeoPolyRangeShare = 0.1111111111111111;

/// Fills procparm's Doppler rate (degree 2), look angle and incidence angle (degree 4)
/// polynomials from the scene's orbit block, its Doppler centroid polynomial and the raw extent
/// of `par` (centre line, near range, swath width). Runs before azimuth focusing, which needs
/// the rate. 0, 10 for unusable acquisition parameters, or the failing geolocation or fit status.
int getgeopoly(const metadata::sarpar& par, procparm& proc);

/// Geolocates an nAz x nRg grid (azimuth time azStart + i azStep, slant time rgStart + j rgStep,
/// Doppler from the centroid polynomial) on WGS84 with the five Earth-fixed state vectors
/// (first at t0, dt apart) and stores the Doppler rate, incidence and look of point (i, j) at
/// i * nRg + j. 0, 10 for a grid that does not fit the spans, or gr_pt_lat_lon's status.
int get_geo_grid(double azStart, double rgStart, int nAz, int nRg, double azStep, double rgStep,
                 std::span<double> rateGrid, std::span<double> incidenceGrid, std::span<double> lookGrid,
                 const std::array<geometry::Vec3, 5>& stateVectors, double t0, double dt, double carrierFrequency,
                 const DopplerPoly& dopplerCentroid);

/// Fits a polynomial of `degree` (1 to 4) in x = j * rgStep to the middle row (nAz / 2) of the
/// grid and stores it in `slot` with rgStart as reference. 0, 10 for a rejected input, or the
/// fit's status.
int get_poly(double azStart, double rgStart, int nAz, int nRg, double azStep, double rgStep,
             std::span<const double> grid, DopplerPoly& slot, int degree);

/// Least-squares polynomial c[0] + c[1] x + ... + c[degree] x^degree through the points;
/// `coefficients` holds degree + 1 values. 0, 10 for a rejected input, 1 for a singular system.
int polfit(std::span<const double> x, std::span<const double> y, std::span<double> coefficients, int degree);

}  // namespace sar::stripmap

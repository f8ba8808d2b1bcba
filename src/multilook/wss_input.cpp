#include "multilook/wss_input.hpp"

#include <exception>

#include "geometry/orbit_file.hpp"
#include "geometry/orbit_interp.hpp"
#include "base/constants.hpp"

namespace sar::multilook {

int wss_sub_swaths(const envisat::Level1Product& p, std::array<WsSubSwath, 5>& swaths, std::string& error) {
  if (int st = envisat::check_wss_layout(p, error)) return st;
  if (int st = envisat::check_measurements(p, error)) return st;
  for (int d = 1; d <= 5; ++d) {
    const envisat::Dsd* mds = p.find("MDS" + std::to_string(d));
    const envisat::GeolocationRecord* geo = p.geolocation_of(d);
    WsSubSwath& s = swaths[static_cast<std::size_t>(d - 1)];
    s.path = p.path;
    s.offset = mds->offset;
    s.records = mds->count;
    s.rowPrefix = static_cast<int32_t>(envisat::kMdsRowPrefix);
    s.samples = static_cast<int>((mds->recordSize - envisat::kMdsRowPrefix) / 4);
    // The tie point's sample number counts from 1.
    s.nearTime = geo->firstSlantTime - (static_cast<double>(geo->firstSample) - 1.0) * 2.0 * p.mpp[static_cast<std::size_t>(d - 1)].rangeSpacing / base::kSpeedOfLight;
    s.incidence = geo->firstIncidence;
    if (static_cast<std::size_t>(d - 1) < p.dcc.size()) s.centroid = p.dcc[static_cast<std::size_t>(d - 1)].coefficients[0];
    if (s.samples < 1 || !(s.incidence > 0.0 && s.incidence < 90.0)) {
      error = "sub-swath SS" + std::to_string(d) + " of " + p.path + " has no usable geometry";
      return 10;
    }
  }
  return 0;
}

int orbit_geometry(const std::string& orbitPath, double time, double carrierFrequency, SlcGrid& grid,
                   std::string& error) {
  try {
    const geometry::OrbitData orbit = geometry::read_orbit(orbitPath);
    const auto near = geometry::nearest_state_vectors(orbit, time - 120.0, 5);
    if (near.size() < 5) throw std::runtime_error("the orbit ends near the scene");
    for (std::size_t k = 0; k < 5; ++k)
      for (std::size_t a = 0; a < 3; ++a) {
        grid.positions[3 * k + a] = near[k].position[a];
        grid.velocities[3 * k + a] = near[k].velocity[a];
      }
    grid.orbitFirstTime = near[0].time;
    grid.orbitStep = near[1].time - near[0].time;
    grid.carrierFrequency = carrierFrequency;
    grid.hasOrbit = grid.orbitStep > 0.0;
  } catch (const std::exception& e) {
    error = "orbit " + orbitPath + ": " + e.what();
    return 10;
  }
  return 0;
}

}  // namespace sar::multilook

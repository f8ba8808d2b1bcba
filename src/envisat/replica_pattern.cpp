#include "envisat/replica_pattern.hpp"

#include <cmath>
#include <numbers>

#include "base/diagnostics.hpp"
#include "envisat/aux_products.hpp"
#include "geometry/orbit_interp.hpp"

namespace sar::envisat {

int envi_orbit(const std::string& orbitPath, sarpar& par, metadata::SceneReferences& proc) {
  base::Frame frame("envi_orbit");
  if (par.prf <= 0.0 || par.lines <= 0) return 10;
  const double duration = par.lines / par.prf;
  proc.orbitSpacing = duration / 3.0;
  proc.orbitStartTime = par.azimuthStartTime - proc.orbitSpacing / 2.0;
  const double centre = par.azimuthStartTime + duration / 2.0;
  int orbitNumber = 0;
  double node = 0.0;
  const int st = geometry::interp_orb_l(orbitPath, centre, 5, proc.orbitSpacing, proc.orbitPositions,
                                        proc.orbitVelocities, &orbitNumber, 1, &node);
  if (st != 0) return frame.check(st);
  proc.orbitNumber = orbitNumber;
  par.ascending_node_time = node;
  return 0;
}

int envi_rgpattern(const std::string& xcaPath, const std::string& insPath, sarpar& par, metadata::SceneReferences& proc) {
  base::Frame frame("envi_rgpattern");
  const XcaRecord xca = XcaRecord::read(xcaPath);
  const InsRecord ins = InsRecord::read(insPath);
  const auto gains = xca.elevation_gains(par.swath_number, par.polarization_type);
  proc.patternLength = kPatternLength;
  proc.pattern.resize(kPatternLength);
  for (int k = 0; k < kPatternLength; ++k)
    proc.pattern[static_cast<std::size_t>(k)] = static_cast<float>(std::pow(10.0, 0.05 * gains[static_cast<std::size_t>(k)]));
  proc.patternCentre = ins.pattern_reference_angle(par.swath_number);
  proc.patternStep = kPatternStep;
  return 0;
}

int envi_syntchirp(sarpar& par, metadata::SceneReferences& proc) {
  base::Frame frame("envi_syntchirp");
  return metadata::synthetic_chirp(par, proc);
}

}  // namespace sar::envisat

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
  // An orbit that does not reach over the scene, or no orbit at all, is the input's fault:
  // the error carries the file and its span up to the job.
  const geometry::OrbitData orbit = geometry::read_orbit(orbitPath);
  const geometry::OrbitSamples s = geometry::interpolate_orbit(orbit, centre, {5, proc.orbitSpacing, true, false});
  for (std::size_t i = 0; i < 5; ++i)
    for (std::size_t a = 0; a < 3; ++a) {
      proc.orbitPositions[3 * i + a] = s.positions[i][a];
      proc.orbitVelocities[3 * i + a] = s.velocities[i][a];
    }
  proc.orbitNumber = s.orbit_number;
  par.ascending_node_time = geometry::interpolate_orbit(orbit, centre, {1, 0.0, false, true}).node_time;
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

int envi_slot_pattern(const std::string& xcaPath, const std::string& insPath, int slot, int pol,
                      std::vector<float>& amplitude, double& referenceDeg) {
  base::Frame frame("envi_slot_pattern");
  const XcaRecord xca = XcaRecord::read(xcaPath);
  const InsRecord ins = InsRecord::read(insPath);
  const auto gains = xca.elevation_gains(slot, pol);
  amplitude.resize(kPatternLength);
  for (int k = 0; k < kPatternLength; ++k)
    amplitude[static_cast<std::size_t>(k)] = static_cast<float>(std::pow(10.0, 0.05 * gains[static_cast<std::size_t>(k)]));
  referenceDeg = ins.pattern_reference_angle(slot);
  return 0;
}

int envi_syntchirp(sarpar& par, metadata::SceneReferences& proc) {
  base::Frame frame("envi_syntchirp");
  return metadata::synthetic_chirp(par, proc);
}

}  // namespace sar::envisat

#pragma once
// What a sensor reader knows of a scene beyond its raw lines and hands to any processor: the
// orbit over the scene, the range reference and the elevation antenna pattern. Readers fill it;
// processors read it; neither knows the other's records.
#include <array>
#include <complex>
#include <cstdint>
#include <vector>

namespace sar::metadata {

struct SceneReferences {
  // Orbit over the scene: five Earth-fixed state vectors (x, y, z each), the first at
  // orbitStartTime (sec85), orbitSpacing seconds apart.
  std::array<double, 15> orbitPositions{};
  std::array<double, 15> orbitVelocities{};
  double orbitStartTime = 0.0;
  double orbitSpacing = 0.0;
  int32_t orbitNumber = 0;
  // Range reference: the nominal chirp, centred, amplitude bandwidth / length.
  std::vector<std::complex<float>> replica;
  int32_t replicaLength = 0;
  // Elevation antenna pattern, linear amplitude, patternStep degrees apart around patternCentre.
  int32_t patternLength = 0;
  std::vector<float> pattern;
  double patternCentre = 0.0;
  double patternStep = 0.0;
};

}  // namespace sar::metadata

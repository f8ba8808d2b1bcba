#pragma once
// The three steps that complete what a job knows of the scene after extraction: the orbit
// sampled over the scene, the elevation pattern of the channel, and the nominal range chirp.
#include <string>
#include <vector>

#include "envisat/records.hpp"
#include "metadata/scene_references.hpp"

namespace sar::envisat {

/// Elevation pattern: 201 entries, 0.05 degrees apart.
inline constexpr int kPatternLength = 201;
inline constexpr double kPatternStep = 0.05;

/// Five state vectors T/3 apart centred on the scene (T = lines / PRF), the orbit number and
/// the ascending node time. Returns 0, or 10 for a channel without lines; throws
/// geometry::OrbitError for an orbit file that cannot be read or does not cover the scene.
int envi_orbit(const std::string& orbitPath, sarpar& par, metadata::SceneReferences& proc);
/// Pattern of the channel's beam and polarisation from ASA_XCA (dB to linear amplitude), its
/// centre look angle from ASA_INS. Returns 0, or kFileIo-class failures as raised by the readers.
int envi_rgpattern(const std::string& xcaPath, const std::string& insPath, sarpar& par, metadata::SceneReferences& proc);
/// Pattern of a beam slot (1-8) and polarisation from ASA_XCA as linear amplitudes, and the
/// look angle (degrees) of its middle entry from ASA_INS. The wide swath sub-swaths SS1-SS5 use
/// slots 8, 3, 4, 5, 6. Returns 0; the readers raise on files that are not such products.
int envi_slot_pattern(const std::string& xcaPath, const std::string& insPath, int slot, int pol,
                      std::vector<float>& amplitude, double& referenceDeg);
/// The nominal linear FM replica: N = round(fs * tau / resampling), centred (zero phase in the
/// middle), every part scaled by B / N.
int envi_syntchirp(sarpar& par, metadata::SceneReferences& proc);

}  // namespace sar::envisat

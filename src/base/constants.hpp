#pragma once
// Physical and mathematical constants shared by every subsystem, so that a slant time, a
// wavelength or a phase is computed with the same numbers wherever it is computed.
#include <numbers>

namespace sar::base {

inline constexpr double kPi = std::numbers::pi;
inline constexpr double kTwoPi = 2.0 * std::numbers::pi;
inline constexpr double kDegree = std::numbers::pi / 180.0;
/// Speed of light in vacuum, m/s (exact by the SI's definition of the metre).
inline constexpr double kSpeedOfLight = 299792458.0;

}  // namespace sar::base

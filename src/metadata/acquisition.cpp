#include "metadata/acquisition.hpp"

#include <cmath>
#include <numbers>

namespace sar::metadata {

int synthetic_chirp(const sarpar& par, SceneReferences& refs) {
  const double resampling = par.resampling_factor > 0 ? par.resampling_factor : 1;
  const double fs = par.samplingRate / resampling;
  const double tau = par.pulse_length;
  const double bandwidth = par.chirp_bandwidth;
  const long n = std::lround(std::floor(par.samplingRate * tau / resampling + 0.5));
  if (n < 1 || tau <= 0.0) return 10;
  refs.replica.resize(static_cast<std::size_t>(n));
  const double rate = std::numbers::pi * bandwidth / tau;
  for (long i = 0; i < n; ++i) {
    const double t = (static_cast<double>(i) - (n - 1) / 2.0) / fs;
    const double phase = rate * t * t;  // in double, applied to float samples
    refs.replica[static_cast<std::size_t>(i)] = {static_cast<float>(std::cos(phase)), static_cast<float>(std::sin(phase))};
  }
  const float scale = static_cast<float>(bandwidth / n);
  for (auto& s : refs.replica) s = {s.real() * scale, s.imag() * scale};
  refs.replicaLength = static_cast<int32_t>(n);
  return 0;
}

}  // namespace sar::metadata

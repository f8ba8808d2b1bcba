#include <algorithm>
#include <cmath>
#include <cstring>
#include <string>

#include "base/convert.hpp"
#include "base/diagnostics.hpp"
#include "dsp/fft.hpp"
#include "scansar/wide_swath.hpp"
#include "base/constants.hpp"

namespace sar::scansar {
namespace {
constexpr int kRejected = 10;
using base::kPi;

int reject(const std::string& why) {
  base::report(base::kReportError, "Wide swath acquisition: " + why);
  return kRejected;
}

}  // namespace

int derive_geometry(std::span<const sarpar> channels, scansar& scan) {
  if (channels.size() != kSwaths) return reject("five sub-swaths expected, got " + std::to_string(channels.size()));
  scan = scansar{};
  const sarpar& first = channels[0];
  scan.samplingRate = first.samplingRate;
  scan.carrierFrequency = first.carrierFrequency;
  scan.firstLineTime = first.azimuthStartTime;
  scan.bursts = first.burst_count;
  if (!(scan.samplingRate > 0.0) || !(scan.carrierFrequency > 0.0)) return reject("no sampling or carrier frequency");
  std::array<bool, kSwaths> named{};
  for (int k = 0; k < kSwaths; ++k) {
    const sarpar& c = channels[static_cast<std::size_t>(k)];
    const auto i = static_cast<std::size_t>(k);
    if (!(c.prf > 0.0) || c.burst_echoes < 2 || c.samples < 1 || c.swath_rank < kBurstSpacing)
      return reject("sub-swath SS" + std::to_string(k + 1) + " has no PRF, bursts, samples or rank");
    if (c.burst_count != scan.bursts) return reject("sub-swaths hold different burst counts");
    if (c.ss_order < 0 || c.ss_order >= kSwaths || named[static_cast<std::size_t>(c.ss_order)])
      return reject("the firing order is not a permutation of the five sub-swaths");
    named[static_cast<std::size_t>(c.ss_order)] = true;
    scan.order[i] = c.ss_order;
    scan.prf[i] = c.prf;
    scan.nearTime[i] = c.nearRangeTime;
    scan.farTime[i] = std::max(c.far_range_time, c.nearRangeTime);
    scan.pulseLength[i] = c.pulse_length;
    scan.chirpBandwidth[i] = c.chirp_bandwidth;
    scan.rank[i] = c.swath_rank;
    scan.spacing[i] = kBurstSpacing;
    scan.echoes[i] = c.burst_echoes;
    scan.samples[i] = c.samples;
    scan.spread[i] = static_cast<int32_t>(std::lround((scan.farTime[i] - scan.nearTime[i]) * scan.samplingRate));
    scan.fftLength[i] = dsp::genpow(scan.spread[i] + c.samples, 1);
  }
  if (scan.bursts < 1) return reject("no whole burst cycle");
  for (int k = 0; k < kSwaths; ++k)
    scan.successor[static_cast<std::size_t>(scan.order[static_cast<std::size_t>(k)])] =
        scan.order[static_cast<std::size_t>((k + 1) % kSwaths)];
  // Offsets of each sub-swath's first echo from the first fired one's, walking the firing list:
  // the rest of this block after its echoes, then the noise PRIs that open the next block.
  scan.burstOffset[static_cast<std::size_t>(scan.order[0])] = 0.0;
  for (int k = 0; k + 1 < kSwaths; ++k) {
    const auto a = static_cast<std::size_t>(scan.order[static_cast<std::size_t>(k)]);
    const auto b = static_cast<std::size_t>(scan.order[static_cast<std::size_t>(k + 1)]);
    scan.burstOffset[b] = scan.burstOffset[a] + (scan.echoes[a] + scan.spacing[a]) / scan.prf[a] +
                          (scan.rank[b] - scan.spacing[b]) / scan.prf[b];
  }
  for (std::size_t i = 0; i < kSwaths; ++i) scan.cycleTime += (scan.echoes[i] + scan.rank[i]) / scan.prf[i];
  return 0;
}

int check_bursts(const scansar& scan, wsparm& par) {
  if (par.lastBurst == 0) par.lastBurst = scan.bursts;
  if (par.firstBurst < 1 || par.lastBurst > scan.bursts || par.firstBurst > par.lastBurst) {
    base::report(base::kReportError, "Wrong number of bursts to focus chosen");
    return 1;
  }
  return 0;
}

double line_time(const scansar& scan, const wsparm& par, int64_t line) {
  return scan.firstLineTime + static_cast<double>(line) * par.azimuthStep;
}

void encode_line_prefix(double sec85, int32_t line, unsigned char* out17) {
  base::sec852mjd(sec85, out17);
  out17[12] = 0;
  const auto u = static_cast<uint32_t>(line);
  out17[13] = static_cast<unsigned char>(u >> 24);
  out17[14] = static_cast<unsigned char>(u >> 16);
  out17[15] = static_cast<unsigned char>(u >> 8);
  out17[16] = static_cast<unsigned char>(u);
}

double decode_line_prefix(const unsigned char* in17, int32_t& line) {
  const uint32_t u = (static_cast<uint32_t>(in17[13]) << 24) | (static_cast<uint32_t>(in17[14]) << 16) |
                     (static_cast<uint32_t>(in17[15]) << 8) | static_cast<uint32_t>(in17[16]);
  line = static_cast<int32_t>(u);
  return base::mjd2sec85(in17);
}

double ScallopModel::gain(double f, double fdc) const {
  const double B = halfWavelengthOverSpeed;
  const double thetaC = std::asin(std::clamp(fdc * B, -1.0, 1.0));
  const double theta = std::asin(std::clamp(f * B, -1.0, 1.0));
  // sinc(y) = sin(y) / y with y = pi (L / lambda) sin(off-beam angle): the one-way amplitude of a
  // uniform aperture; its fourth power is the two-way power.
  double y = kPi * lengthOverWavelength * std::sin(thetaC - theta);
  if (normalisedSinc) y *= kPi;
  const double s = y == 0.0 ? 1.0 : std::sin(y) / y;
  return s * s * s * s;
}

double ScallopModel::scale(double f, double fdc, double prf) const {
  return 1.0 / (std::sqrt(gain(f, fdc) + gain(f + prf, fdc) + gain(f - prf, fdc)) + 1e-4);
}

}  // namespace sar::scansar

// Range focusing of the bursts of one sub-swath.
//
// Echo i of a burst is placed at column round((t_i - t_near) fs) of a zeroed row, so that every
// column is one slant range across the sub-swath whatever its sampling window, and correlated
// with the nominal replica. The replica's first sample lies half a sample into the pulse; the
// half sample is taken back in the frequency domain, so that column k holds the target whose
// echo's leading edge is two-way time t_near + k / fs. The chirp band is Hamming weighted
// (c + (1 - c) cos(2 pi f / B)), the rest of the spectrum is cut.
#include <algorithm>
#include <cmath>
#include <cstring>
#include <string>
#include <vector>

#include "base/diagnostics.hpp"
#include "dsp/fft.hpp"
#include "scansar/files.hpp"
#include "scansar/wide_swath.hpp"
#include "stripmap/range_focus.hpp"
#include "base/constants.hpp"

namespace sar::scansar {
namespace {
constexpr int kRejected = 10;
using base::kPi;
}  // namespace

int burst_range_focus(const std::string& dir, int s, const sarpar& channel, const scansar& scan, const wsparm& par,
                      std::span<const fcomplex> replica, RangeFocused& out, CorrelationSums& sums) {
  base::Frame frame("burst_range_focus");
  const auto i = static_cast<std::size_t>(s);
  const int32_t N = scan.echoes[i], samples = scan.samples[i], spread = scan.spread[i];
  const auto Lr = static_cast<int32_t>(replica.size());
  const int32_t L = dsp::genpow(samples + spread, 1);
  const double fs = scan.samplingRate, near = scan.nearTime[i];
  if (Lr < 1 || Lr > samples) {
    base::report(base::kReportError, "Range focusing SS" + std::to_string(s + 1) + ": replica of " +
                                         std::to_string(Lr) + " samples against echoes of " + std::to_string(samples));
    return frame.check(kRejected);
  }
  out.width = samples + spread - Lr + 1;
  out.firstValid = spread;
  out.validColumns = samples - Lr + 1 - spread;
  out.nearTime = near;
  if (out.validColumns < 1) {
    base::report(base::kReportError, "Range focusing SS" + std::to_string(s + 1) + ": sampling window spread of " +
                                         std::to_string(spread) + " samples leaves no valid column");
    return frame.check(kRejected);
  }
  const int64_t record = 4 + 8 * static_cast<int64_t>(samples);
  ByteReader in(channel.raw_file.empty() ? channel.extrPath : channel.raw_file, "extracted sub-swath");
  const int64_t need = record * N * static_cast<int64_t>(scan.bursts);
  if (in.size() < need) {
    base::report(base::kReportError, "Range focusing SS" + std::to_string(s + 1) + ": the extracted file holds " +
                                         std::to_string(in.size() / record) + " echoes, " + std::to_string(scan.bursts) +
                                         " bursts need " + std::to_string(need / record));
    return frame.check(kRejected);
  }

  // Reference: conj(replica spectrum), the half sample back, the band's weight.
  dsp::cvector H(static_cast<std::size_t>(L));
  std::copy(replica.begin(), replica.end(), H.begin());
  dsp::fft_c(L, L, 1, 1, 1, 0, H);
  const double B = scan.chirpBandwidth[i] > 0.0 ? scan.chirpBandwidth[i] : fs;
  for (int32_t k = 0; k < L; ++k) {
    const int32_t ks = k <= L / 2 ? k : k - L;
    const double f = ks * fs / L;
    double w = 0.0;
    if (std::abs(f) <= B / 2) w = par.rangeHamming + (1.0 - par.rangeHamming) * std::cos(2.0 * kPi * f / B);
    const double ph = 2.0 * kPi * ks / L * 0.5;
    const std::complex<double> r = std::conj(std::complex<double>(H[static_cast<std::size_t>(k)])) *
                                   std::polar(w, ph);
    H[static_cast<std::size_t>(k)] = fcomplex(static_cast<float>(r.real()), static_cast<float>(r.imag()));
  }

  sums.sum.assign(static_cast<std::size_t>(out.width), {0.0, 0.0});
  sums.power.assign(static_cast<std::size_t>(out.width), 0.0);
  sums.pairs = 0;
  // The same per Doppler granule: the first and the last take the whole scene, the others their
  // own run of bursts.
  const GranuleLayout layout = granule_layout(scan.bursts, par.granuleLength, scan.cycleTime);
  sums.granules.assign(static_cast<std::size_t>(layout.count), CorrelationSums{});
  CorrelationSums burst;
  ByteWriter file(dir + "/rgfoc_ss" + std::to_string(s + 1));
  std::vector<unsigned char> raw(static_cast<std::size_t>(record * N));
  dsp::cvector echoes(static_cast<std::size_t>(N) * samples), rows(static_cast<std::size_t>(N) * L);
  std::vector<float> times(static_cast<std::size_t>(N));
  std::vector<fcomplex> focused(static_cast<std::size_t>(N) * out.width);
  for (int32_t b = 0; b < scan.bursts; ++b) {
    in.read(raw.data(), record * N);
    for (int32_t e = 0; e < N; ++e) {
      const unsigned char* at = raw.data() + record * e;
      std::memcpy(&times[static_cast<std::size_t>(e)], at, 4);
      std::memcpy(echoes.data() + static_cast<std::ptrdiff_t>(e) * samples, at + 4, 8 * static_cast<std::size_t>(samples));
    }
    stripmap::ortogN(echoes, samples, samples, N, b);
    std::fill(rows.begin(), rows.end(), fcomplex{});
    for (int32_t e = 0; e < N; ++e) {
      const long shift = std::lround((times[static_cast<std::size_t>(e)] - near) * fs);
      if (shift < 0 || shift > spread + 1 || shift + samples > L) {
        base::report(base::kReportError, "Wrong SWST: too large (SS" + std::to_string(s + 1) + ", burst " +
                                             std::to_string(b + 1) + ", shift " + std::to_string(shift) + ")");
        return frame.check(kRejected);
      }
      std::copy_n(echoes.data() + static_cast<std::ptrdiff_t>(e) * samples, samples,
                  rows.data() + static_cast<std::ptrdiff_t>(e) * L + shift);
    }
    dsp::fft_c(L, L, N, N, 1, 0, rows);
    for (int32_t e = 0; e < N; ++e) {
      fcomplex* row = rows.data() + static_cast<std::ptrdiff_t>(e) * L;
      for (int32_t k = 0; k < L; ++k) row[k] *= H[static_cast<std::size_t>(k)];
    }
    dsp::fft_c(L, L, N, N, -1, 0, rows);
    for (int32_t e = 0; e < N; ++e)
      std::copy_n(rows.data() + static_cast<std::ptrdiff_t>(e) * L, out.width,
                  focused.data() + static_cast<std::ptrdiff_t>(e) * out.width);
    burst.sum.assign(static_cast<std::size_t>(out.width), {0.0, 0.0});
    burst.power.assign(static_cast<std::size_t>(out.width), 0.0);
    for (int32_t e = 1; e < N; ++e) {
      const fcomplex* a = focused.data() + static_cast<std::ptrdiff_t>(e) * out.width;
      const fcomplex* p = a - out.width;
      for (int32_t k = 0; k < out.width; ++k) {
        const std::complex<double> x(a[k]), y(p[k]);
        burst.sum[static_cast<std::size_t>(k)] += x * std::conj(y);
        burst.power[static_cast<std::size_t>(k)] += 0.5 * (std::norm(x) + std::norm(y));
      }
    }
    burst.pairs = N - 1;
    sums.add(burst);
    for (int32_t g = 1; g + 1 < layout.count; ++g) {
      const int32_t first = layout.first[static_cast<std::size_t>(g)];
      if (b >= first && b < first + layout.length) sums.granules[static_cast<std::size_t>(g)].add(burst);
    }
    const double t = near;
    file.write(&t, 8);
    file.write(focused.data(), 8 * static_cast<int64_t>(focused.size()));
  }
  file.commit();
  return 0;
}

}  // namespace sar::scansar

// The vector loops of the chirp-Z Stolt kernel against the formulas they stand for, for both
// instruction sets (the AVX2 set only where the processor has it): lengths that leave tails of
// every size, bins outside the chirp-Z span, and node tables held at their ends.
#include <gtest/gtest.h>

#include <cmath>
#include <numbers>
#include <random>
#include <string>
#include <vector>

#include "stripmap/stolt_lines.hpp"

namespace {

using sar::dsp::fcomplex;
namespace detail = sar::stripmap::detail;

struct KernelSet {
  std::string name;
  const detail::LineKernels* kernels;
};

std::vector<KernelSet> kernel_sets() {
  std::vector<KernelSet> sets{{"baseline", &detail::base_isa::kernels}};
  __builtin_cpu_init();
  if (__builtin_cpu_supports("avx2") && __builtin_cpu_supports("fma")) sets.push_back({"avx2", &detail::avx2::kernels});
  return sets;
}

TEST(StoltLines, TwoPointMixMatchesTheFormulaWithTailsAndBinsOutside) {
  constexpr int kBins = 40;
  std::mt19937 gen(7);
  std::uniform_real_distribution<float> amp(-3.0f, 3.0f);
  std::vector<fcomplex> z(kBins + 1);
  for (int i = 0; i < kBins; ++i) z[static_cast<std::size_t>(i)] = {amp(gen), amp(gen)};
  z[kBins] = {};
  for (const auto& set : kernel_sets()) {
    for (const int count : {1, 3, 4, 5, 8, 11, 37}) {
      std::vector<double> x(static_cast<std::size_t>(count)), s(x.size()), c(x.size());
      std::uniform_real_distribution<double> pos(-2.0, kBins + 2.0), ph(-4.0, 4.0);
      for (std::size_t u = 0; u < x.size(); ++u) {
        x[u] = pos(gen);
        s[u] = std::sin(ph(gen));
        c[u] = std::cos(ph(gen));
      }
      // The edges of the span: the last whole bin, just below zero and the first bin beyond.
      x[0] = count > 1 ? kBins - 1 + 0.25 : -1e-9;
      if (count > 2) x[1] = -1e-9;
      if (count > 3) x[2] = kBins;
      std::vector<fcomplex> out(x.size(), fcomplex{99.0f, 99.0f});
      set.kernels->two_point(z.data(), kBins, x.data(), s.data(), c.data(), count, out.data());
      for (std::size_t u = 0; u < x.size(); ++u) {
        const double f = std::floor(x[u]);
        std::complex<double> want;
        if (f >= 0 && f < kBins) {
          const auto p = static_cast<std::size_t>(f);
          const double t = x[u] - f;
          want = ((1.0 - t) * std::complex<double>(z[p]) - t * std::complex<double>(z[p + 1])) *
                 std::complex<double>(c[u], s[u]);
        }
        EXPECT_NEAR(out[u].real(), want.real(), 2e-6) << set.name << " count " << count << " u " << u << " x " << x[u];
        EXPECT_NEAR(out[u].imag(), want.imag(), 2e-6) << set.name << " count " << count << " u " << u << " x " << x[u];
      }
    }
  }
}

TEST(StoltLines, PhasesBinsAndWeightsMatchTheFormulas) {
  // Wavenumbers of an ENVISAT-like line: kr near 223 rad/m, ky a few tenths.
  const double kr0 = 223.4, dk = 0.8 / 2048, y = 0.37, kx0 = std::sqrt(kr0 * kr0 - 0.3 * 0.3);
  const detail::ReferencePhase ref{kr0 - 0.4, dk, y * y, kx0, 8.3e5, 0.02 - kr0, 41.5, 17};
  const detail::OutputBins bins{kx0 - 0.39, dk * 1.003, y * y, kr0 - 0.4, dk, 0.7, 5};
  const double az[4] = {0.2, 1.0, 0.9, 0.1}, g[4] = {1.0, 2.0, 3.0, 5.0};
  const double k0 = kr0 - 0.3;
  const detail::NodeWeights nodes{az, g, 4, k0, 0.2, kr0, 0.25};
  for (const auto& set : kernel_sets()) {
    for (const int count : {1, 6, 2041}) {
      const auto n = static_cast<std::size_t>(count);
      std::vector<double> phase(n), x(n), turn(n), w(n);
      set.kernels->reference_phase(ref, count, phase.data());
      set.kernels->output_bins(bins, count, x.data(), turn.data());
      double s1 = 0.5, s2 = 0.25;  // the sums are added to
      set.kernels->node_weights(nodes, kr0 - 0.4, 17, dk * 400, count, w.data(), s1, s2);
      double want1 = 0.5, want2 = 0.25;
      for (std::size_t u = 0; u < n; ++u) {
        const double k = ref.kStart + (ref.first + static_cast<double>(u)) * dk;
        const double wantPhase = (std::sqrt(k * k - y * y) - kx0) * ref.R0 - (k + ref.shift) * ref.sr;
        // The phases are a few hundred thousand radians: what matters is the error in radians.
        EXPECT_NEAR(phase[u], wantPhase, 1e-6) << set.name << " u " << u;
        const double kx = bins.kxStart + (bins.first + static_cast<double>(u)) * bins.kxStep;
        const double wantX = (std::sqrt(kx * kx + y * y) - bins.kStart) / dk;
        EXPECT_NEAR(x[u], wantX, 1e-9) << set.name << " u " << u;
        EXPECT_NEAR(turn[u], std::numbers::pi * (wantX - std::floor(wantX)) + 0.7, 1e-9) << set.name << " u " << u;
        const double kw = kr0 - 0.4 + (17 + static_cast<double>(u)) * dk * 400;
        const double v = std::clamp((kw - k0) / 0.2, 0.0, 3.0);
        const auto i = std::min(static_cast<std::size_t>(v), std::size_t{2});
        const double t = v - static_cast<double>(i);
        const double wantW = az[i] + t * (az[i + 1] - az[i]), wantG = g[i] + t * (g[i + 1] - g[i]);
        EXPECT_NEAR(w[u], wantW, 1e-12) << set.name << " u " << u;
        if (std::abs(kw - kr0) < 0.25) {
          want1 += wantG;
          want2 += wantW * wantW * wantG;
        }
      }
      EXPECT_NEAR(s1, want1, 1e-9 * std::max(1.0, want1)) << set.name << " count " << count;
      EXPECT_NEAR(s2, want2, 1e-9 * std::max(1.0, want2)) << set.name << " count " << count;
    }
  }
}

}  // namespace

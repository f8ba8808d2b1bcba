// Multi-look beat frequency estimator. Two range looks of a bright scatterer, separated by s in
// range frequency, see its range migration as a phase: their product beats at the absolute
// centroid times s fs / f0 along azimuth. The beat spectrum is zoomed by a chirp-Z transform onto
// the frequencies of the ambiguities between Minamb and Maxamb.
#include <algorithm>
#include <bit>
#include <cmath>
#include <cstdarg>
#include <cstdint>
#include <cstdio>
#include <cstring>
#include <numbers>
#include <string>
#include <vector>

#if defined(__SSE2__)
#include <emmintrin.h>
#endif
#if defined(__GNUC__) && defined(__x86_64__)
#include <immintrin.h>
#endif

#include "base/diagnostics.hpp"
#include "doppler/dcest.hpp"
#include "dsp/czt.hpp"
#include "dsp/filters.hpp"
#include "base/constants.hpp"

namespace sar::doppler {

namespace detail {
struct MlbfState {
  int Lf = 0;
  std::vector<double> separations;                // s[i], fractions of fs
  std::vector<std::vector<fcomplex>> upper, lower;  // reversed band-pass filters per look pair
  bool zoomReady = false;
  dsp::czt_plan zoom;
  int M = 0;
  double fstart = 0.0;
};
}  // namespace detail

namespace {
using base::kPi;

/// 1 when v is infinite or NaN.
inline std::uint32_t exponent_all_set(float v) {
  return static_cast<std::uint32_t>((std::bit_cast<std::uint32_t>(v) & 0x7f800000u) == 0x7f800000u);
}

/// Outputs of a range look filter computed side by side, one per vector lane.
constexpr int kLanes = 16;

/// Accumulates, for the `padded` outputs j (a multiple of kLanes), the Lf taps of both looks:
/// x = (re, im)[offset[t] + j], u += x h, l += x conj(h), four real products per tap. Every
/// lane performs the same single-precision operations in the same order whatever the vector
/// width, so the instruction set chosen at run time does not change a bit of the result (the
/// library is built without multiply-add contraction).
template <int W>
[[gnu::always_inline]] inline void filter_lanes(const float* re, const float* im, const std::size_t* offset, int lf,
                                                const float* hr, const float* hi, int padded, float* ur, float* ui,
                                                float* lr, float* li) {
  typedef float V __attribute__((vector_size(4 * W)));
  for (int j = 0; j < padded; j += W) {
    V su{}, sv{}, sl{}, sm{};
    for (int t = 0; t < lf; ++t) {
      V xr, xi;
      std::memcpy(&xr, re + offset[t] + static_cast<std::size_t>(j), sizeof(V));
      std::memcpy(&xi, im + offset[t] + static_cast<std::size_t>(j), sizeof(V));
      const float fr = hr[t], fi = hi[t];
      const V a = xr * fr, b = xi * fi, c = xr * fi, d = xi * fr;
      su += a - b;
      sv += c + d;
      sl += a + b;
      sm += d - c;
    }
    std::memcpy(ur + j, &su, sizeof(V));
    std::memcpy(ui + j, &sv, sizeof(V));
    std::memcpy(lr + j, &sl, sizeof(V));
    std::memcpy(li + j, &sm, sizeof(V));
  }
}

using FilterKernel = void (*)(const float*, const float*, const std::size_t*, int, const float*, const float*, int,
                              float*, float*, float*, float*);

void filter_base(const float* re, const float* im, const std::size_t* offset, int lf, const float* hr, const float* hi,
                 int padded, float* ur, float* ui, float* lr, float* li) {
  filter_lanes<4>(re, im, offset, lf, hr, hi, padded, ur, ui, lr, li);
}

#if defined(__GNUC__) && defined(__x86_64__)
#define SAR_MLBF_WIDE_KERNELS 1
[[gnu::target("avx")]] void filter_avx(const float* re, const float* im, const std::size_t* offset, int lf,
                                       const float* hr, const float* hi, int padded, float* ur, float* ui, float* lr,
                                       float* li) {
  filter_lanes<8>(re, im, offset, lf, hr, hi, padded, ur, ui, lr, li);
}
[[gnu::target("avx512f")]] void filter_avx512(const float* re, const float* im, const std::size_t* offset, int lf,
                                              const float* hr, const float* hi, int padded, float* ur, float* ui,
                                              float* lr, float* li) {
  filter_lanes<16>(re, im, offset, lf, hr, hi, padded, ur, ui, lr, li);
}
#endif

/// The widest kernel the processor runs.
FilterKernel filter_kernel() {
#ifdef SAR_MLBF_WIDE_KERNELS
  __builtin_cpu_init();
  if (__builtin_cpu_supports("avx512f")) return filter_avx512;
  if (__builtin_cpu_supports("avx")) return filter_avx;
#endif
  return filter_base;
}

/// The two range looks of every line at every Decfac-th output, each output the dot product of
/// Lf samples with the reversed filter, in single precision with the roundings of
/// std::complex<float>: u += x h and l += x conj(h) term by term in tap order. The lower filter
/// is the conjugate of the upper one, so the four real products of x h serve both looks:
/// x conj(h) = (xr hr + xi hi, xi hr - xr hi). The outputs are computed side by side (one
/// per vector lane) from the lines split once per block into their Decfac polyphase
/// components, so that every tap reads contiguous samples.
class LookFilter {
 public:
  /// Splits the `nl` lines of `ns` samples of `block`; the storage is kept from block to block.
  void load(std::span<const fcomplex> block, int ns, int nl, int lf, int decfac, int nd) {
    lf_ = lf;
    nd_ = nd;
    padded_ = (nd + kLanes - 1) / kLanes * kLanes;
    stride_ = padded_ + (lf - 1) / decfac + 1;
    line_ = static_cast<std::size_t>(decfac) * static_cast<std::size_t>(stride_);
    re_.resize(line_ * static_cast<std::size_t>(nl));
    im_.resize(re_.size());
    offset_.resize(static_cast<std::size_t>(lf));
    for (auto* v : {&ur_, &ui_, &lr_, &li_, &br_, &bi_}) v->resize(static_cast<std::size_t>(padded_));
    for (int t = 0; t < lf; ++t)
      offset_[static_cast<std::size_t>(t)] =
          static_cast<std::size_t>(t % decfac) * static_cast<std::size_t>(stride_) + static_cast<std::size_t>(t / decfac);
    for (int l = 0; l < nl; ++l) {
      const float* row = reinterpret_cast<const float*>(block.data() + static_cast<std::size_t>(l) * static_cast<std::size_t>(ns));
      for (int r = 0; r < decfac; ++r) {
        float* pr = re_.data() + static_cast<std::size_t>(l) * line_ + static_cast<std::size_t>(r) * static_cast<std::size_t>(stride_);
        float* pi = im_.data() + static_cast<std::size_t>(l) * line_ + static_cast<std::size_t>(r) * static_cast<std::size_t>(stride_);
        // Samples r, r + decfac, ... of the line; positions beyond it only reach the padding
        // lanes and read zero.
        const int count = r < ns ? std::min(stride_, (ns - r + decfac - 1) / decfac) : 0;
        const float* x = row + 2 * r;
        const std::ptrdiff_t step = 2 * static_cast<std::ptrdiff_t>(decfac);
        for (int m = 0; m < count; ++m) {
          pr[m] = x[m * step];
          pi[m] = x[m * step + 1];
        }
        std::fill(pr + count, pr + stride_, 0.0f);
        std::fill(pi + count, pi + stride_, 0.0f);
      }
    }
  }

  /// Beats up conj(lo) of line l's looks with the upper filter (hr, hi), read through
  /// beat_re() and beat_im() (j < nd), with the roundings of the complex product:
  /// (ur lr - ui (-li), ur (-li) + ui lr) = (ur lr + ui li, ui lr - ur li). False when a beat is
  /// not finite (overflow; any non-finite look makes its beat non-finite), in which case the
  /// caller takes the plain complex path for the line.
  bool run(int l, const float* hr, const float* hi) {
    const float* re = re_.data() + static_cast<std::size_t>(l) * line_;
    const float* im = im_.data() + static_cast<std::size_t>(l) * line_;
    filter_(re, im, offset_.data(), lf_, hr, hi, padded_, ur_.data(), ui_.data(), lr_.data(), li_.data());
    const float* ur = ur_.data();
    const float* ui = ui_.data();
    const float* lr = lr_.data();
    const float* li = li_.data();
    float* br = br_.data();
    float* bi = bi_.data();
    std::uint32_t bad = 0, zero = 0;
    for (int j = 0; j < nd_; ++j) {
      br[j] = ur[j] * lr[j] + ui[j] * li[j];
      bi[j] = ui[j] * lr[j] - ur[j] * li[j];
      bad |= exponent_all_set(br[j]) | exponent_all_set(bi[j]);
      zero |= static_cast<std::uint32_t>(br[j] == 0.0f) & static_cast<std::uint32_t>(bi[j] == 0.0f);
    }
    zero_ = zero != 0;
    return bad == 0;
  }
  /// Whether a beat of the last line run is exactly zero.
  bool any_zero() const { return zero_; }
  const float* beat_re() const { return br_.data(); }
  const float* beat_im() const { return bi_.data(); }

 private:
  FilterKernel filter_ = filter_kernel();
  int lf_ = 0, nd_ = 0, padded_ = 0, stride_ = 0;
  bool zero_ = false;
  std::size_t line_ = 0;
  std::vector<float> re_, im_;
  std::vector<std::size_t> offset_;
  std::vector<float> ur_, ui_, lr_, li_, br_, bi_;
};

// b / |b| for every sample, |b| as std::abs(std::complex<float>) gives it for finite b: the
// square root of the exact double sum of squares, rounded to float. Every version performs
// these same correctly rounded operations.
void normalise_base(float* v, std::size_t n) {
  std::size_t k = 0;
#if defined(__SSE2__)
  for (; k + 2 <= n; k += 2) {
    const __m128 x = _mm_loadu_ps(v + 2 * k);  // r0 i0 r1 i1
    const __m128d lo = _mm_cvtps_pd(x), hi = _mm_cvtps_pd(_mm_movehl_ps(x, x));
    const __m128d sq0 = _mm_mul_pd(lo, lo), sq1 = _mm_mul_pd(hi, hi);
    // (r0^2 + i0^2, r1^2 + i1^2)
    const __m128d sum = _mm_add_pd(_mm_unpacklo_pd(sq0, sq1), _mm_unpackhi_pd(sq0, sq1));
    const __m128 mag = _mm_cvtpd_ps(_mm_sqrt_pd(sum));  // m0 m1 0 0
    _mm_storeu_ps(v + 2 * k, _mm_div_ps(x, _mm_unpacklo_ps(mag, mag)));
  }
#endif
  for (; k < n; ++k) {
    const double r = v[2 * k], i = v[2 * k + 1];
    const float mag = static_cast<float>(std::sqrt(r * r + i * i));
    v[2 * k] /= mag;
    v[2 * k + 1] /= mag;
  }
}

#ifdef SAR_MLBF_WIDE_KERNELS
[[gnu::target("avx")]] void normalise_avx(float* v, std::size_t n) {
  std::size_t k = 0;
  for (; k + 4 <= n; k += 4) {
    const __m256 x = _mm256_loadu_ps(v + 2 * k);  // r0 i0 r1 i1 r2 i2 r3 i3
    const __m256d lo = _mm256_cvtps_pd(_mm256_castps256_ps128(x));
    const __m256d hi = _mm256_cvtps_pd(_mm256_extractf128_ps(x, 1));
    // (r0^2 + i0^2, r2^2 + i2^2, r1^2 + i1^2, r3^2 + i3^2)
    const __m256d sum = _mm256_hadd_pd(_mm256_mul_pd(lo, lo), _mm256_mul_pd(hi, hi));
    const __m128 m = _mm256_cvtpd_ps(_mm256_sqrt_pd(sum));              // m0 m2 m1 m3
    const __m128 mag = _mm_shuffle_ps(m, m, _MM_SHUFFLE(3, 1, 2, 0));  // m0 m1 m2 m3
    const __m256 dup = _mm256_insertf128_ps(_mm256_castps128_ps256(_mm_unpacklo_ps(mag, mag)), _mm_unpackhi_ps(mag, mag), 1);
    _mm256_storeu_ps(v + 2 * k, _mm256_div_ps(x, dup));
  }
  if (k < n) normalise_base(v + 2 * k, n - k);
}

// The masked forms (all lanes set) stand for the plain ones, whose undefined pass-through
// operand makes this compiler warn.
[[gnu::target("avx512f")]] void normalise_avx512(float* v, std::size_t n) {
  const __m512i even = _mm512_set_epi64(14, 12, 10, 8, 6, 4, 2, 0);
  const __m512i pairs = _mm512_set_epi32(7, 7, 6, 6, 5, 5, 4, 4, 3, 3, 2, 2, 1, 1, 0, 0);
  constexpr __mmask8 all8 = 0xff;
  constexpr __mmask16 all16 = 0xffff;
  std::size_t k = 0;
  for (; k + 8 <= n; k += 8) {
    const __m256 x0 = _mm256_loadu_ps(v + 2 * k), x1 = _mm256_loadu_ps(v + 2 * k + 8);
    const __m512d lo = _mm512_maskz_cvtps_pd(all8, x0), hi = _mm512_maskz_cvtps_pd(all8, x1);
    const __m512d sl = _mm512_mul_pd(lo, lo), sh = _mm512_mul_pd(hi, hi);
    // r^2 + i^2 in the even lanes of each, gathered into one register.
    const __m512d pl = _mm512_add_pd(sl, _mm512_maskz_permute_pd(all8, sl, 0x55));
    const __m512d ph = _mm512_add_pd(sh, _mm512_maskz_permute_pd(all8, sh, 0x55));
    const __m512d sum = _mm512_permutex2var_pd(pl, even, ph);
    const __m256 mag = _mm512_maskz_cvtpd_ps(all8, _mm512_maskz_sqrt_pd(all8, sum));
    const __m512 dup = _mm512_maskz_permutexvar_ps(all16, pairs, _mm512_castps256_ps512(mag));
    _mm512_storeu_ps(v + 2 * k, _mm512_div_ps(_mm512_loadu_ps(v + 2 * k), dup));
  }
  if (k < n) normalise_base(v + 2 * k, n - k);
}
#endif

void normalise(std::span<fcomplex> beat) {
  using Kernel = void (*)(float*, std::size_t);
  static const Kernel run = [] {
#ifdef SAR_MLBF_WIDE_KERNELS
    __builtin_cpu_init();
    if (__builtin_cpu_supports("avx512f")) return static_cast<Kernel>(normalise_avx512);
    if (__builtin_cpu_supports("avx")) return static_cast<Kernel>(normalise_avx);
#endif
    return static_cast<Kernel>(normalise_base);
  }();
  run(reinterpret_cast<float*>(beat.data()), beat.size());
}

/// Working storage of one thread, kept from block to block (the split lines of a block alone
/// take about a megabyte).
struct Scratch {
  LookFilter looks;
  std::vector<fcomplex> beat, zoomed;
  std::vector<double> power;
  std::vector<float> hr, hi;
};

Scratch& scratch() {
  thread_local Scratch s;
  return s;
}

/// Appends to `log` when given, prints otherwise.
[[gnu::format(printf, 2, 3)]] void say(std::string* log, const char* format, ...) {
  va_list args, again;
  va_start(args, format);
  va_copy(again, args);
  const int n = std::vsnprintf(nullptr, 0, format, args);
  va_end(args);
  std::string text(static_cast<std::size_t>(std::max(n, 0)) + 1, '\0');
  std::vsnprintf(text.data(), text.size(), format, again);
  va_end(again);
  text.resize(static_cast<std::size_t>(std::max(n, 0)));
  if (log) {
    log->append(text);
  } else {
    std::fputs(text.c_str(), stdout);
  }
}

}  // namespace

int multimlbf_init(dcestconf& conf) {
  base::Frame frame("multimlbf_init");
  conf.mlbf.reset();
  if (conf.Nummlbf < 1) return 10;
  if (!(conf.Lookrs != 0.0) || !(conf.RgBand > 0.0)) return 10;
  auto st = std::make_shared<detail::MlbfState>();
  int lf = conf.Flength;
  if (lf % 2 == 0) {
    ++lf;
    std::printf("\nWARNING from mlbf_init(): Remez filter length must be odd. Filter length is set to : %d.", lf);
  }
  if (lf < 3 || lf >= conf.Blocks) return 10;
  st->Lf = lf;
  const double B = conf.RgBand;
  const double pass = (conf.Lookbf * B - conf.Lookbt * B) / 2.0;
  const double stop = (conf.Lookbf * B + conf.Lookbt * B) / 2.0;
  std::vector<dsp::fcomplex> proto(static_cast<std::size_t>(lf));
  const double bands[4] = {0.0, pass, stop, 0.5};
  const double desired[2] = {1.0, 0.0};
  const double weights[2] = {conf.Lookrp / conf.Lookrs, 1.0};
  if (int e = frame.check(dsp::remezOBX(proto, lf, 2, bands, desired, weights))) return e;

  const int n = conf.Nummlbf;
  const double s0 = 2.0 * conf.Lookbf * B;
  const double ds = n == 1 ? 0.0 : ((1.0 - conf.Lookbf) * B - s0) / (n - 1);
  st->upper.assign(static_cast<std::size_t>(n), std::vector<fcomplex>(static_cast<std::size_t>(lf)));
  st->lower = st->upper;
  for (int i = 0; i < n; ++i) {
    const double s = s0 + i * ds;
    st->separations.push_back(s);
    for (int t = 0; t < lf; ++t) {
      const double a = (t - (lf - 1) / 2) * s * kPi;
      const double p = proto[static_cast<std::size_t>(t)].real();
      // Stored reversed, so that the dot product below is a convolution.
      st->upper[static_cast<std::size_t>(i)][static_cast<std::size_t>(lf - 1 - t)] =
          fcomplex(static_cast<float>(p * std::cos(a)), static_cast<float>(p * std::sin(a)));
      st->lower[static_cast<std::size_t>(i)][static_cast<std::size_t>(lf - 1 - t)] =
          fcomplex(static_cast<float>(p * std::cos(a)), static_cast<float>(-p * std::sin(a)));
    }
  }
  conf.mlbf = std::move(st);
  return 0;
}

int cirpZ_init(dcestconf& conf) {
  base::Frame frame("cirpZ_init");
  if (!conf.mlbf) return 1;
  auto& st = *conf.mlbf;
  if (!(conf.Dftstep > 0.0) || !(conf.carrier > 0.0)) return 10;
  const double sLast = st.separations.back();
  const double span = conf.fs / conf.carrier * std::fabs(conf.Maxamb - conf.Minamb) * sLast / conf.Dftstep;
  if (!(span < 1e7)) return 10;
  st.M = std::max(1, static_cast<int>(std::ceil(span)));
  st.fstart = conf.fs / conf.carrier * sLast * conf.Minamb;
  if (int e = frame.check(dsp::czt_makep_c(st.zoom, conf.Blockl, st.M))) return e;
  st.zoomReady = true;
  return 0;
}

void mlbf_free(dcestconf& conf) {
  if (conf.mlbf && conf.mlbf->zoomReady) dsp::czt_destp_c(conf.mlbf->zoom);
  conf.mlbf.reset();
}

int multimlbf(dcestconf& conf, std::span<const fcomplex> block, int index, std::string* log) {
  if (!conf.mlbf || !conf.mlbf->zoomReady) return 1;
  if (index < 0 || static_cast<std::size_t>(index) >= conf.mlbfBlocks.size()) return 10;
  if (conf.Blocks < 1 || conf.Blockl < 1 ||
      block.size() < static_cast<std::size_t>(conf.Blocks) * static_cast<std::size_t>(conf.Blockl))
    return 10;
  const auto& st = *conf.mlbf;
  auto& rec = conf.mlbfBlocks[static_cast<std::size_t>(index)];
  const int ns = conf.Blocks, nl = conf.Blockl, lf = st.Lf;
  const int decfac = std::max(1, conf.Decfac);
  const int no = ns - 2 * (lf / 2);
  if (no < 1) return 10;
  const int nd = (no + decfac - 1) / decfac;
  const int pairs = static_cast<int>(st.separations.size());
  rec.estimates.assign(static_cast<std::size_t>(pairs), 0.0);
  rec.quality.assign(static_cast<std::size_t>(pairs), 0.0);

  Scratch& work = scratch();
  std::vector<fcomplex>& beat = work.beat;
  std::vector<fcomplex>& zoomed = work.zoomed;
  std::vector<double>& power = work.power;
  std::vector<float>& hr = work.hr;
  std::vector<float>& hi = work.hi;
  LookFilter& looks = work.looks;
  beat.resize(static_cast<std::size_t>(nd) * static_cast<std::size_t>(nl));
  zoomed.resize(static_cast<std::size_t>(nd) * static_cast<std::size_t>(st.M));
  power.resize(static_cast<std::size_t>(st.M));
  hr.resize(static_cast<std::size_t>(lf));
  hi.resize(static_cast<std::size_t>(lf));
  looks.load(block, ns, nl, lf, decfac, nd);
  for (int i = 0; i < pairs; ++i) {
    say(log, "Evaluating MLBF %d of %d...", i + 1, pairs);
    const fcomplex* fu = st.upper[static_cast<std::size_t>(i)].data();
    const fcomplex* fl = st.lower[static_cast<std::size_t>(i)].data();
    for (int t = 0; t < lf; ++t) {
      hr[static_cast<std::size_t>(t)] = fu[t].real();
      hi[static_cast<std::size_t>(t)] = fu[t].imag();
    }
    bool anyZero = false, allFinite = true;
    // Range looks on every Decfac-th output, their beat stored as one azimuth series per output.
    for (int l = 0; l < nl; ++l) {
      const fcomplex* row = block.data() + static_cast<std::size_t>(l) * static_cast<std::size_t>(ns);
      fcomplex* series = beat.data() + static_cast<std::size_t>(l);
      if (looks.run(l, hr.data(), hi.data())) {
        const float* br = looks.beat_re();
        const float* bi = looks.beat_im();
        for (int j = 0; j < nd; ++j)
          series[static_cast<std::size_t>(j) * static_cast<std::size_t>(nl)] = fcomplex(br[j], bi[j]);
        anyZero = anyZero || looks.any_zero();
        continue;
      }
      // Overflowing samples: the complex arithmetic with its handling of infinities.
      allFinite = false;
      for (int j = 0; j < nd; ++j) {
        const fcomplex* x = row + static_cast<std::ptrdiff_t>(j) * decfac;
        fcomplex up(0.0f, 0.0f), lo(0.0f, 0.0f);
        for (int t = 0; t < lf; ++t) {
          up += x[t] * fu[t];
          lo += x[t] * fl[t];
        }
        const fcomplex b = up * std::conj(lo);
        anyZero = anyZero || (b.real() == 0.0f && b.imag() == 0.0f);
        series[static_cast<std::size_t>(j) * static_cast<std::size_t>(nl)] = b;
      }
    }
    if (!anyZero) {
      if (allFinite) {
        normalise(beat);
      } else {
        for (auto& b : beat) b /= std::abs(b);
      }
    }
    if (int e = dsp::pczt_c(st.zoom, beat, zoomed, -2.0 * kPi * conf.Dftstep, 2.0 * kPi * st.fstart, nd)) return e;
    // Mean power over the series, each bin summed in series order.
    std::fill(power.begin(), power.end(), 0.0);
    for (int j = 0; j < nd; ++j) {
      const fcomplex* z = zoomed.data() + static_cast<std::size_t>(j) * static_cast<std::size_t>(st.M);
      for (int k = 0; k < st.M; ++k) power[static_cast<std::size_t>(k)] += std::norm(z[k]);
    }
    for (auto& p : power) p = p / nd / nl;
    int k0 = 0;
    for (int k = 1; k < st.M; ++k)
      if (power[static_cast<std::size_t>(k)] > power[static_cast<std::size_t>(k0)]) k0 = k;
    double freq = k0 * conf.Dftstep;
    double peak = power[static_cast<std::size_t>(k0)];
    if (k0 > 0 && k0 < st.M - 1) {
      const double y0 = power[static_cast<std::size_t>(k0 - 1)], y1 = peak, y2 = power[static_cast<std::size_t>(k0 + 1)];
      const double den = y0 - 2.0 * y1 + y2;
      if (den != 0.0) {
        const double d = 0.5 * (y0 - y2) / den;
        freq = (k0 + d) * conf.Dftstep;
        peak = y1 - 0.25 * (y0 - y2) * d;
      }
    }
    const int guard = static_cast<int>(std::ceil(conf.Peakwid / conf.Dftstep / 2.0));
    double side = 0.0;
    for (int k = 0; k < st.M; ++k)
      if (std::abs(k - k0) > guard) side = std::max(side, power[static_cast<std::size_t>(k)]);
    const double s = st.separations[static_cast<std::size_t>(i)];
    rec.estimates[static_cast<std::size_t>(i)] = conf.carrier / conf.fs / s * (st.fstart + freq);
    rec.quality[static_cast<std::size_t>(i)] = side > 0.0 ? peak / side : 0.0;
    say(log, "estimation: %f... \n", rec.estimates[static_cast<std::size_t>(i)]);
  }
  return 0;
}

}  // namespace sar::doppler

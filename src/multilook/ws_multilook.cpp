#include "multilook/ws_multilook.hpp"

#include <algorithm>
#include <cmath>
#include <complex>
#include <filesystem>
#include <fstream>
#include <numbers>
#include <system_error>

#include "base/convert.hpp"
#include "base/diagnostics.hpp"
#include "dsp/fft.hpp"
#include "io/cell_types.hpp"
#include "io/data_file.hpp"

namespace sar::multilook {

namespace {

constexpr int kRejected = 10;
constexpr double kHalfLightSpeed = 149896229.0;
constexpr int kMostLooks = 15;
constexpr int kMostDecimation = 32767;
// Output lines made at a time: the looks of every sub-swath for one strip of the joined scene.
constexpr int kStripLines = 4096;
// Zero padding of a range line, as a share of its samples: the tails of a bright target's looks
// wrap around the transform into the padding, not onto the far end of the line.
constexpr int kPaddingShare = 4;

int fail(WsMultilookResult& res, int status, std::string text) {
  res.error = std::move(text);
  base::report(status == kRejected ? base::kReportError : base::kReportFileIo, res.error);
  return status;
}

int round_half_away(double x) { return static_cast<int>(x >= 0.0 ? std::floor(x + 0.5) : std::ceil(x - 0.5)); }

bool read_times(const WsSubSwath& s, std::vector<double>& times) {
  std::ifstream in(s.path, std::ios::binary);
  if (!in) return false;
  const int64_t pitch = s.rowPrefix + io::cell_size(s.cellType) * static_cast<int64_t>(s.samples);
  times.resize(static_cast<std::size_t>(s.records));
  unsigned char mjd[12];
  for (int64_t r = 0; r < s.records; ++r) {
    in.seekg(s.offset + r * pitch);
    if (!in.read(reinterpret_cast<char*>(mjd), 12)) return false;
    times[static_cast<std::size_t>(r)] = base::mjd2sec85(mjd);
  }
  return true;
}

}  // namespace

std::vector<Burst> find_bursts(const std::vector<double>& times, double lineStep) {
  std::vector<Burst> bursts;
  for (std::size_t r = 0; r < times.size(); ++r) {
    const bool starts = r == 0 || std::fabs(times[r] - times[r - 1] - lineStep) > 0.5 * lineStep;
    if (starts) bursts.push_back({static_cast<int64_t>(r), 0, times[r]});
    ++bursts.back().lines;
  }
  return bursts;
}

double burst_weight(double v, double w1, double w2) {
  if (w1 < 0.0) return 0.0;
  const double a = std::fabs(v);
  if (a <= w1) return 1.0;
  if (!(w2 > 0.0)) return 0.0;
  const double q = (a - w1) / w2;
  if (q > 1.0) return 0.0;
  return std::cos(0.5 * std::numbers::pi * q);
}

std::vector<double> look_centres(int looks, double band, double fullBand) {
  std::vector<double> c;
  if (looks < 2) return {0.0};
  const double spacing = (fullBand - band) / (looks - 1);
  if (looks % 2 == 1) c.push_back(0.0);
  for (int i = 1; i <= (looks - 1) / 2; ++i) {
    c.push_back(i * spacing);
    c.push_back(-i * spacing);
  }
  if (looks % 2 == 0)  // an even count (never planned, but kept symmetric)
    for (int i = 0; i < looks / 2; ++i) {
      c.push_back((i + 0.5) * spacing);
      c.push_back(-(i + 0.5) * spacing);
    }
  return c;
}

double look_power_share(const std::vector<double>& centres, double band, double fullBand, double window) {
  if (centres.empty() || !(band > 0.0) || !(fullBand > 0.0)) return 1.0;
  // Mean of the spectrum's power over [f0, f1], clipped to the band.
  auto mean_power = [&](double f0, double f1) {
    f0 = std::max(f0, -0.5 * fullBand);
    f1 = std::min(f1, 0.5 * fullBand);
    if (!(f1 > f0)) return 0.0;
    constexpr int kSteps = 256;
    double s = 0.0;
    for (int k = 0; k < kSteps; ++k) {
      const double f = f0 + (k + 0.5) * (f1 - f0) / kSteps;
      const double w = window + (1.0 - window) * std::cos(2.0 * std::numbers::pi * f / fullBand);
      s += w * w;
    }
    return s / kSteps * (f1 - f0);
  };
  double looks = 0.0;
  for (double c : centres) looks += mean_power(c - 0.5 * band, c + 0.5 * band) / band;
  const double whole = mean_power(-0.5 * fullBand, 0.5 * fullBand) / fullBand;
  return looks / static_cast<double>(centres.size()) / whole;
}

int plan_looks(double band, double incidence, int groundResolution, LookPlan& plan) {
  const double usable = 0.8 * band;
  const double needed = (kHalfLightSpeed / std::sin(incidence * std::numbers::pi / 180.0)) / groundResolution;
  if (usable < needed) {
    plan.looks = 1;
    plan.band = usable;
  } else {
    const int k = static_cast<int>(std::floor(usable * 1.3 / needed));
    plan.looks = k - 1 + (k % 2);
    plan.band = needed;
  }
  if (plan.looks > kMostLooks) return 1;
  plan.centres = look_centres(plan.looks, plan.band, band);
  return 0;
}

int run_ws_multilook(const std::array<WsSubSwath, 5>& sw, const WsMultilookConfig& cfg, const SlcGrid& orbit,
                     const std::string& output, WsMultilookResult& res) {
  base::Frame frame("mlook::run");
  res = {};
  const double dt = cfg.lineStep, fs = cfg.samplingRate;
  if (!(dt > 0.0) || !(fs > 0.0) || cfg.groundStep <= 0 || cfg.groundStep > 1000 || cfg.groundResolution <= 0 ||
      cfg.groundResolution > 1000)
    return fail(res, kRejected, "multilook parameters out of range");
  const double overlapSum = 2.0 * cfg.w1 + cfg.w2;
  if (cfg.w1 < 0.0 || cfg.w2 < 0.0 || overlapSum < 0.5 || std::fabs(overlapSum - std::round(overlapSum)) > 1e-9)
    return fail(res, kRejected, "burst weights W1 " + std::to_string(cfg.w1) + ", W2 " + std::to_string(cfg.w2) +
                                    ": 2 W1 + W2 must be a whole number, or overlapping bursts do not add up to one");

  // Bursts of every sub-swath, from the record times.
  std::array<std::vector<Burst>, 5> bursts;
  std::size_t available = SIZE_MAX;
  for (std::size_t s = 0; s < 5; ++s) {
    std::vector<double> times;
    if (sw[s].samples < 1 || sw[s].records < 1 || (sw[s].cellType != io::kShortComplex && sw[s].cellType != io::kFloatComplex) ||
        !read_times(sw[s], times))
      return fail(res, 1, "cannot read the records of sub-swath " + std::to_string(s + 1));
    bursts[s] = find_bursts(times, dt);
    available = std::min(available, bursts[s].size());
  }
  const int skip = cfg.burstsToSkip;
  const int process = cfg.burstsToProcess == 0 ? static_cast<int>(available) - skip : cfg.burstsToProcess;
  if (skip < 0 || process < 1 || static_cast<std::size_t>(skip + process) > available)
    return fail(res, kRejected, "Bursts To Skip + Bursts To Process are greater than available bursts");

  // Burst cycle and the window the bursts hold.
  double cycle = 0.0;
  int cycles = 0;
  int shortest = INT32_MAX;
  for (std::size_t s = 0; s < 5; ++s) {
    const auto& b = bursts[s];
    for (std::size_t k = 1; k < b.size(); ++k, ++cycles)
      cycle += (b[k].firstTime + 0.5 * (b[k].lines - 1) * dt) - (b[k - 1].firstTime + 0.5 * (b[k - 1].lines - 1) * dt);
    for (const auto& x : b) shortest = std::min(shortest, x.lines);
  }
  cycle = cycles > 0 ? cycle / cycles : shortest * dt;
  res.cycle = cycle;
  const double window = 0.5 * (shortest - 1) * dt / cycle;  // half a burst, in cycles
  if (cfg.w1 + cfg.w2 > window + 1e-9)
    return fail(res, kRejected, "burst weights W1 + W2 = " + std::to_string(cfg.w1 + cfg.w2) +
                                    " cycles reach beyond the " + std::to_string(window) + " the bursts hold");

  // Range looks and decimation.
  std::array<LookPlan, 5> plans;
  int looks = 1;
  int decimation = kMostDecimation;
  for (std::size_t s = 0; s < 5; ++s) {
    if (plan_looks(cfg.rangeBand, sw[s].incidence, cfg.groundResolution, plans[s]) != 0)
      return fail(res, 1, "Number of estimated range looks must be lower than 15, try changing Ground Resolution");
    looks = std::max(looks, plans[s].looks);
    const double slantStep = cfg.groundStep * std::sin(sw[s].incidence * std::numbers::pi / 180.0);
    decimation = std::min(decimation, static_cast<int>(std::floor(slantStep / (kHalfLightSpeed / fs))));
  }
  decimation = std::clamp(decimation, 1, kMostDecimation);
  for (auto& p : plans) p.centres = look_centres(looks, p.band, cfg.rangeBand);
  res.rangeLooks = looks;
  res.decimation = decimation;

  // The common line grid.
  double first = 1e300, last = -1e300;
  for (std::size_t s = 0; s < 5; ++s) {
    const Burst& a = bursts[s][static_cast<std::size_t>(skip)];
    const Burst& z = bursts[s][static_cast<std::size_t>(skip + process - 1)];
    first = std::min(first, a.firstTime);
    last = std::max(last, z.firstTime + (z.lines - 1) * dt);
  }
  const int lines = round_half_away((last - first) / dt) + 1;
  res.lines = lines;
  res.firstLineTime = first;
  res.lineStep = dt;
  const double outStep = decimation / fs;
  res.slantStep = outStep;
  res.nearTime = sw[0].nearTime;
  // Each sub-swath starts at a whole column of the common grid; the fraction of a column its
  // near range lies off that grid is taken out by a delay in the range spectrum, so that targets
  // of every sub-swath stand where their range puts them.
  std::array<int, 5> firstColumn{};
  std::array<double, 5> delay{};
  for (std::size_t s = 0; s < 5; ++s) {
    firstColumn[s] = round_half_away((sw[s].nearTime - sw[0].nearTime) / outStep);
    delay[s] = (sw[s].nearTime - sw[0].nearTime) - firstColumn[s] * outStep;
  }

  std::array<int, 5> outSamples{};
  for (std::size_t s = 0; s < 5; ++s) outSamples[s] = sw[s].samples / decimation;

  // Join the sub-swaths: each keeps its columns up to the middle of its overlap with the next.
  // Sub-swaths that do not meet (a short sampling window) leave the columns between them at 0.
  std::array<int, 5> endColumn{}, from{}, to{};
  for (std::size_t s = 0; s < 5; ++s) endColumn[s] = firstColumn[s] + outSamples[s];
  for (std::size_t s = 0; s < 5; ++s) {
    from[s] = s == 0 ? firstColumn[0] : std::max(to[s - 1], firstColumn[s]);
    const int middle = s == 4 ? endColumn[4] : firstColumn[s + 1] + (endColumn[s] - firstColumn[s + 1]) / 2;
    to[s] = std::max(from[s], std::min(middle, endColumn[s]));
  }
  if (*std::min_element(firstColumn.begin(), firstColumn.end()) < 0 ||
      *std::max_element(endColumn.begin(), endColumn.end()) != endColumn[4])
    return fail(res, kRejected, "the sub-swaths are not in order of range");
  const int slantWidth = endColumn[4];
  std::vector<double> spreading(static_cast<std::size_t>(slantWidth));
  const double refTime = sw[0].nearTime + 0.5 * slantWidth * outStep;
  for (int i = 0; i < slantWidth; ++i) spreading[static_cast<std::size_t>(i)] = std::pow((sw[0].nearTime + i * outStep) / refTime, 3.0);

  // Per sub-swath: weighted, detected, decimated looks summed over bursts, for the output lines
  // [blockFirst, blockFirst + blockLines) only: the joined scene is made a strip at a time, so
  // memory does not grow with the scene's length.
  std::array<std::vector<float>, 5> power;
  auto accumulate = [&](int blockFirst, int blockLines) -> int {
  for (std::size_t s = 0; s < 5; ++s) {
    const int padded = sw[s].samples + sw[s].samples / kPaddingShare;
    const int n = dsp::genpow((padded + decimation - 1) / decimation, 1) * decimation;
    const int k = n / decimation;
    power[s].assign(static_cast<std::size_t>(blockLines) * outSamples[s], 0.0f);
    const LookPlan& plan = plans[s];
    const int bandBins = std::max(1, round_half_away(plan.band / fs * n));
    const int fullBins = std::max(1, round_half_away(cfg.rangeBand / fs * n));
    if (bandBins > k) return fail(res, kRejected, "a range look is wider than the decimated rate");
    // Looks are cut square: their resolution is the ground resolution asked for.
    const double scale = static_cast<double>(fullBins) / (static_cast<double>(bandBins) * n * n * looks) /
                         look_power_share(plan.centres, plan.band, cfg.rangeBand, sw[s].rangeWindow);
    dsp::cvector spectrum(static_cast<std::size_t>(n)), small(static_cast<std::size_t>(k));
    // x(t - delay): the spectrum times exp(-j 2 pi f delay), f the bin's frequency.
    std::vector<io::fcomplex> shift(static_cast<std::size_t>(n));
    for (int b = 0; b < n; ++b) {
      const double f = (b <= n / 2 ? b : b - n) * fs / n;
      shift[static_cast<std::size_t>(b)] =
          std::polar(1.0f, static_cast<float>(-2.0 * std::numbers::pi * f * delay[s]));
    }
    dsp::fft_plan forward, backward;
    if (dsp::fft_makep_c(forward, n, n, 1, 1, 1, 0, 1) != 0 || dsp::fft_makep_c(backward, k, k, 1, 1, -2, 0, 1) != 0)
      return fail(res, 1, "no transform plan");

    io::DataFile in(sw[s].path);
    in.headerOffset = sw[s].offset;
    in.rowPrefix = sw[s].rowPrefix;
    in.pixels = sw[s].samples;
    in.lines = static_cast<int32_t>(sw[s].records);
    in.cellType = sw[s].cellType;
    in.byteOrder = sw[s].byteOrder;
    if (in.open(0) != 0) return fail(res, 1, "cannot read sub-swath " + std::to_string(s + 1));
    std::vector<io::fcomplex> row(static_cast<std::size_t>(sw[s].samples));
    std::vector<double> acc(static_cast<std::size_t>(outSamples[s]));
    for (int b = skip; b < skip + process; ++b) {
      const Burst& burst = bursts[s][static_cast<std::size_t>(b)];
      const int burstFirst = round_half_away((burst.firstTime - first) / dt);
      if (burstFirst + burst.lines <= blockFirst || burstFirst >= blockFirst + blockLines) continue;
      const double centre = burst.firstTime + 0.5 * (burst.lines - 1) * dt;
      for (int l = 0; l < burst.lines; ++l) {
        const double t = burst.firstTime + l * dt;
        const double v = (sw[s].centroid / sw[s].rate + t - centre) / cycle;
        const double w = burst_weight(v, cfg.w1, cfg.w2);
        const int line = round_half_away((t - first) / dt);
        if (w == 0.0 || line < blockFirst || line >= blockFirst + blockLines) continue;
        io::BufferIO rd(&in, 0, sw[s].samples, static_cast<int32_t>(burst.firstRecord + l), 1, io::kFloatComplex);
        if (rd.readbuffer(row.data()) != 0) return fail(res, 1, "cannot read sub-swath " + std::to_string(s + 1));
        std::fill(spectrum.begin(), spectrum.end(), io::fcomplex{});
        std::copy(row.begin(), row.end(), spectrum.begin());
        dsp::pfft_c(forward, spectrum);
        for (int b = 0; b < n; ++b) spectrum[static_cast<std::size_t>(b)] *= shift[static_cast<std::size_t>(b)];
        std::fill(acc.begin(), acc.end(), 0.0);
        for (double f : plan.centres) {
          const int centreBin = round_half_away(f / fs * n);
          std::fill(small.begin(), small.end(), io::fcomplex{});
          for (int j = 0; j < bandBins; ++j) {
            const int rel = j - bandBins / 2;  // from the look's centre
            small[static_cast<std::size_t>(((rel % k) + k) % k)] =
                spectrum[static_cast<std::size_t>((((centreBin + rel) % n) + n) % n)];
          }
          dsp::pfft_c(backward, small);
          for (int i = 0; i < outSamples[s]; ++i) acc[static_cast<std::size_t>(i)] += std::norm(small[static_cast<std::size_t>(i)]);
        }
        float* dst = power[s].data() + static_cast<std::size_t>(line - blockFirst) * outSamples[s];
        for (int i = 0; i < outSamples[s]; ++i) dst[i] += static_cast<float>(w * w * scale * acc[static_cast<std::size_t>(i)]);
      }
    }
  }
  return 0;
  };

  std::vector<double> where;
  res.samples = slantWidth;
  res.rangeSpacing = outStep * kHalfLightSpeed;
  if (cfg.groundRange) {
    if (!orbit.hasOrbit) return fail(res, kRejected, "ground range needs the orbit");
    std::vector<double> distance;
    if (int st = ground_distances(orbit, first + 0.5 * lines * dt, sw[0].nearTime, outStep, slantWidth, distance))
      return fail(res, kRejected, "the slant columns cannot be located on the ground (status " + std::to_string(st) + ")");
    where = ground_to_slant(distance, cfg.groundStep);
    if (where.empty()) return fail(res, kRejected, "the ground distances of the slant columns do not increase");
    res.samples = static_cast<int>(where.size());
    res.rangeSpacing = cfg.groundStep;
    double worst = 0.0;
    res.groundSlantTime = fit_ground_columns(where, sw[0].nearTime, outStep, worst);
  }

  const std::string part = output + ".part";
  io::DataFile out(part);
  out.lines = lines;
  out.pixels = res.samples;
  out.cellType = io::kFloat32;
  if (out.open(1) != 0) return fail(res, 1, "cannot write " + part);
  std::vector<double> slant(static_cast<std::size_t>(slantWidth));
  std::vector<float> amplitude(static_cast<std::size_t>(slantWidth));
  for (int l = 0; l < lines; ++l) {
    if (l % kStripLines == 0) {
      if (const int st = accumulate(l, std::min(kStripLines, lines - l)); st != 0) {
        out.close();
        std::error_code ec;
        std::filesystem::remove(part, ec);
        return st;
      }
    }
    const std::size_t row = static_cast<std::size_t>(l % kStripLines);
    for (std::size_t s = 0; s < 5; ++s)
      for (int c = from[s]; c < to[s]; ++c)
        slant[static_cast<std::size_t>(c)] =
            power[s][row * outSamples[s] + static_cast<std::size_t>(c - firstColumn[s])] * spreading[static_cast<std::size_t>(c)];
    if (cfg.groundRange) {
      resample_power(slant, where, amplitude);
    } else {
      for (int c = 0; c < slantWidth; ++c)
        amplitude[static_cast<std::size_t>(c)] = static_cast<float>(std::sqrt(std::max(0.0, slant[static_cast<std::size_t>(c)])));
    }
    io::BufferIO wr(&out, 0, res.samples, l, 1, io::kFloat32);
    if (wr.writebuffer(amplitude.data()) != 0) {
      out.close();
      std::error_code ec;
      std::filesystem::remove(part, ec);
      return fail(res, 1, "cannot write " + part);
    }
  }
  std::error_code ec;
  if (out.close() != 0) {
    std::filesystem::remove(part, ec);
    return fail(res, 1, "cannot write " + part);
  }
  std::filesystem::rename(part, output, ec);
  if (ec) return fail(res, 1, "cannot rename " + part);
  io::DataFile header(output);
  header.lines = lines;
  header.pixels = res.samples;
  header.cellType = io::kFloat32;
  header.byteOrder = out.byteOrder;
  std::filesystem::remove(output + ".hdr", ec);
  if (header.write_hdr() != 0) {
    std::filesystem::remove(output, ec);
    return fail(res, 1, "cannot write the raster header of " + output);
  }
  return 0;
}

}  // namespace sar::multilook

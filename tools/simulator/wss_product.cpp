#include "simulator/wss_product.hpp"

#include <algorithm>
#include <cmath>
#include <complex>
#include <filesystem>
#include <fstream>
#include <random>
#include <stdexcept>

#include "base/convert.hpp"
#include "dsp/fft.hpp"
#include "geometry/geolocation.hpp"
#include "geometry/orbit_file.hpp"
#include "geometry/orbit_interp.hpp"
#include "simulator/header_text.hpp"
#include "base/constants.hpp"

namespace sar::simulator {

namespace {

constexpr double kC = sar::base::kSpeedOfLight;
constexpr int64_t kMppBytes = 2009;
constexpr int64_t kDccBytes = 55;
constexpr int64_t kGeoBytes = 521;
constexpr int64_t kPrefixBytes = 17;
constexpr int64_t kSphFields = 1059;

void put_mjd(std::string& b, std::size_t at, double sec85) { base::sec852mjd(sec85, reinterpret_cast<unsigned char*>(b.data() + at)); }
void put_float(std::string& b, std::size_t at, double v) {
  base::float2ch(static_cast<float>(v), reinterpret_cast<unsigned char*>(b.data() + at), 'm');
}
void put_int(std::string& b, std::size_t at, int32_t v) { base::long2ch(v, reinterpret_cast<unsigned char*>(b.data() + at), 'm'); }

double sinc(double x) { return std::fabs(x) < 1e-12 ? 1.0 : std::sin(M_PI * x) / (M_PI * x); }

/// The SPH text before the DSDs, at the positions of the level 1 products.
std::string sph_fields(double first, double last, double rangeSpacing, double azimuthSpacing, double lineTime,
                       int lineLength) {
  HeaderText h;
  h.quoted("SPH_DESCRIPTOR", "Wide Swath SLC Image", 28);
  h.plain("STRIPLINE_CONTINUITY_INDICATOR", signed_int(0, 3));
  h.plain("SLICE_POSITION", signed_int(1, 3));
  h.plain("NUM_SLICES", signed_int(1, 3));
  h.quoted("FIRST_LINE_TIME", time_text(first), 27);
  h.quoted("LAST_LINE_TIME", time_text(last), 27);
  for (const char* key : {"FIRST_NEAR_LAT", "FIRST_NEAR_LONG", "FIRST_MID_LAT", "FIRST_MID_LONG", "FIRST_FAR_LAT",
                          "FIRST_FAR_LONG", "LAST_NEAR_LAT", "LAST_NEAR_LONG", "LAST_MID_LAT", "LAST_MID_LONG",
                          "LAST_FAR_LAT", "LAST_FAR_LONG"}) {
    const bool lat = std::string(key).find("LAT") != std::string::npos;
    h.plain(key, signed_int(0, 10) + (lat ? "<10-6degN>" : "<10-6degE>"));
  }
  h.spare(36);
  h.quoted("SWATH", "WS ", 3);
  h.quoted("PASS", "DESCENDING", 10);
  h.quoted("SAMPLE_TYPE", "COMPLEX", 8);
  h.quoted("ALGORITHM", "SPECAN ", 7);
  h.quoted("MDS1_TX_RX_POLAR", "V/V", 3);
  h.quoted("MDS2_TX_RX_POLAR", "   ", 3);
  h.quoted("COMPRESSION", "FBAQ4", 5);
  h.plain("AZIMUTH_LOOKS", signed_int(1, 3));
  h.plain("RANGE_LOOKS", signed_int(1, 3));
  h.plain("RANGE_SPACING", signed_exp(rangeSpacing) + "<m>");
  h.plain("AZIMUTH_SPACING", signed_exp(azimuthSpacing) + "<m>");
  h.plain("LINE_TIME_INTERVAL", signed_exp(lineTime) + "<s>");
  h.plain("LINE_LENGTH", signed_int(lineLength, 5) + "<samples>");
  h.quoted("DATA_TYPE", "SWORD", 5);
  std::string text = h.str();
  if (text.size() > static_cast<std::size_t>(kSphFields)) throw std::runtime_error("WSS SPH fields too long");
  text.resize(static_cast<std::size_t>(kSphFields) - 1, ' ');
  text += '\n';
  return text;
}

}  // namespace

WssProduct write_wss_product(const WssConfig& c) {
  if (c.samples < 16 || c.bursts < 1 || c.burst_lines < 2 || c.cycle_lines < 1 || c.overlap < 0 || c.overlap >= c.samples)
    throw std::runtime_error("WSS simulation: impossible sizes");
  const geometry::OrbitData orbit = geometry::read_orbit(c.orbit_path);
  WssProduct out;
  out.first_line_time = base::ascii2sec85(c.start_time);
  const double dt = c.line_time_interval, fs = c.sampling_rate;
  const int lastOffset = *std::max_element(c.swath_offset_lines.begin(), c.swath_offset_lines.end());
  out.lines = (c.bursts - 1) * c.cycle_lines + lastOffset + c.burst_lines;
  for (int s = 0; s < 5; ++s) out.near_time[s] = 2.0 * c.near_range / kC + s * (c.samples - c.overlap) / fs;
  out.reference_range = 0.5 * kC * 0.5 * (out.near_time[0] + out.near_time[4] + c.samples / fs);
  const double t0 = out.first_line_time, t1 = t0 + out.lines * dt;
  out.name = "ASA_WSS_1PNPDE" + compact_time(t0) + "_000000012066_00338_31400_0000.N1";
  out.path = (std::filesystem::path(c.out_dir) / out.name).string();

  // Where the sub-swaths look, at the scene's centre time.
  std::array<double, 5> incidence{}, latitude{}, longitude{};
  for (int s = 0; s < 5; ++s) {
    geometry::grpt_rec rec;
    const auto near = geometry::nearest_state_vectors(orbit, 0.5 * (t0 + t1) - 120.0, 5);
    for (std::size_t k = 0; k < 5; ++k) rec.state_vectors[k] = near[k].position;
    rec.t0 = near[0].time;
    rec.dt = near[1].time - near[0].time;
    rec.azimuth_time = 0.5 * (t0 + t1);
    rec.tau = out.near_time[static_cast<std::size_t>(s)];
    rec.wavelength = kC / 5.331e9;
    if (geometry::gr_pt_lat_lon(rec) != 0) throw std::runtime_error("WSS simulation: the swath misses the Earth");
    incidence[s] = rec.incidence;
    latitude[s] = rec.latitude;
    longitude[s] = rec.longitude;
  }

  // Data set sizes and offsets.
  const int64_t recordBytes = kPrefixBytes + 4 * static_cast<int64_t>(c.samples);
  const int64_t mdsRecords = static_cast<int64_t>(c.bursts) * c.burst_lines;
  const int numDsd = 11;
  const int64_t sphSize = kSphFields + numDsd * static_cast<int64_t>(kDsdBytes);
  int64_t at = static_cast<int64_t>(kMphBytes) + sphSize;
  const int64_t mppAt = at;
  at += 5 * kMppBytes;
  const int64_t dccAt = at;
  at += 5 * kDccBytes;
  const int64_t geoAt = at;
  at += 5 * kGeoBytes;
  std::array<int64_t, 5> mdsAt{};
  for (int s = 0; s < 5; ++s) {
    mdsAt[s] = at;
    if (s + 1 != c.drop_swath) at += mdsRecords * recordBytes;
  }
  const int64_t total = at;

  const double rangeSpacing = kC / (2.0 * fs), azimuthSpacing = 7000.0 * dt;
  std::string sph = sph_fields(t0, t1 - dt, rangeSpacing, azimuthSpacing, dt, c.samples);
  sph += build_dsd({"MDS1 SQ ADS", 'A', "", 0, 0, 0, 0});
  sph += build_dsd({"MAIN PROCESSING PARAMS ADS", 'A', "", mppAt, 5 * kMppBytes, 5, kMppBytes});
  sph += build_dsd({"DOP CENTROID COEFFS ADS", 'A', "", dccAt, 5 * kDccBytes, 5, kDccBytes});
  sph += build_dsd({"SR GR ADS", 'A', "NOT USED", 0, 0, 0, 0});
  sph += build_dsd({"CHIRP PARAMS ADS", 'A', "NOT USED", 0, 0, 0, 0});
  sph += build_dsd({"GEOLOCATION GRID ADS", 'A', "", geoAt, 5 * kGeoBytes, 5, kGeoBytes});
  for (int s = 0; s < 5; ++s) {
    const bool dropped = s + 1 == c.drop_swath;
    sph += build_dsd({"MDS" + std::to_string(s + 1), 'M', dropped ? "NOT USED" : "", dropped ? 0 : mdsAt[s],
                      dropped ? 0 : mdsRecords * recordBytes, dropped ? 0 : mdsRecords, dropped ? 0 : recordBytes});
  }
  if (static_cast<int64_t>(sph.size()) != sphSize) throw std::runtime_error("WSS simulation: SPH size");

  MphFields m;
  m.product = out.name;
  m.proc_time = t1 + 86400.0;
  m.software_ver = "SARSIM/1.0";
  m.sensing_start = t0;
  m.sensing_stop = t1;
  m.abs_orbit = 31400;
  m.tot_size = total;
  m.sph_size = sphSize;
  m.num_dsd = numDsd;
  m.num_data_sets = 8;
  std::string head = build_mph(m) + sph;

  std::string mpp(5 * kMppBytes, '\0'), dcc(5 * kDccBytes, '\0'), geo(5 * kGeoBytes, '\0');
  for (int s = 0; s < 5; ++s) {
    const std::size_t o = static_cast<std::size_t>(s * kMppBytes);
    const double first = t0 + c.swath_offset_lines[s] * dt;
    put_mjd(mpp, o, first);
    put_mjd(mpp, o + 13, first + (mdsRecords - 1) * dt);
    mpp.replace(o + 41, 3, "SS" + std::to_string(s + 1));
    put_float(mpp, o + 44, rangeSpacing);
    put_float(mpp, o + 48, azimuthSpacing);
    put_float(mpp, o + 52, dt);
    put_int(mpp, o + 56, static_cast<int32_t>(mdsRecords));
    put_int(mpp, o + 60, c.samples);
    mpp.replace(o + 64, 5, "SWORD");
    const std::size_t d = static_cast<std::size_t>(s * kDccBytes);
    put_mjd(dcc, d, first);
    put_float(dcc, d + 13, out.near_time[s] * 1e9);
    const std::size_t g = static_cast<std::size_t>(s * kGeoBytes);
    put_mjd(geo, g, first);
    put_int(geo, g + 13, 1);
    put_int(geo, g + 17, static_cast<int32_t>(mdsRecords));
    put_int(geo, g + 25, 1);
    put_float(geo, g + 69, out.near_time[s] * 1e9);
    put_float(geo, g + 113, incidence[s]);
    put_int(geo, g + 157, static_cast<int32_t>(std::lround(latitude[s] * 1e6)));
    put_int(geo, g + 201, static_cast<int32_t>(std::lround(longitude[s] * 1e6)));
    geo.replace(g + 499, 3, "SS" + std::to_string(s + 1));
  }

  std::filesystem::create_directories(c.out_dir);
  std::ofstream file(out.path, std::ios::binary | std::ios::trunc);
  if (!file) throw std::runtime_error("cannot write " + out.path);
  file << head << mpp << dcc << geo;

  std::mt19937 rng(c.seed);
  std::normal_distribution<double> gauss(0.0, std::sqrt(0.5));
  const int n = c.samples;
  const int bandBins = static_cast<int>(std::floor(c.range_band / fs * n));
  std::vector<dsp::fcomplex> line(static_cast<std::size_t>(n));
  std::string record(static_cast<std::size_t>(recordBytes), '\0');
  // The range window over the band's bins, scaled to unit mean power.
  std::vector<double> window(static_cast<std::size_t>(bandBins), 1.0);
  {
    double power = 0.0;
    for (int k = -bandBins / 2; k < bandBins - bandBins / 2; ++k) {
      const double w = c.range_window + (1.0 - c.range_window) * std::cos(2.0 * M_PI * k / bandBins);
      window[static_cast<std::size_t>(k + bandBins / 2)] = w;
      power += w * w;
    }
    for (double& w : window) w /= std::sqrt(power / bandBins);
  }
  for (int s = 0; s < 5; ++s) {
    if (s + 1 == c.drop_swath) continue;
    std::vector<double> spread(static_cast<std::size_t>(n));
    for (int i = 0; i < n; ++i) {
      const double range = 0.5 * kC * (out.near_time[s] + i / fs);
      spread[i] = std::pow(out.reference_range / range, 1.5);
    }
    for (int b = 0; b < c.bursts; ++b) {
      const int firstLine = b * c.cycle_lines + c.swath_offset_lines[s];
      const double phase0 = 2.0 * M_PI * std::uniform_real_distribution<double>(0.0, 1.0)(rng);
      for (int l = 0; l < c.burst_lines; ++l) {
        const int gridLine = firstLine + l;
        // Clutter of the range band: white spectrum inside it (or weighted by the range window,
        // at unit mean power), nothing outside.
        std::fill(line.begin(), line.end(), dsp::fcomplex{});
        for (int k = -bandBins / 2; k < bandBins - bandBins / 2; ++k)
          line[static_cast<std::size_t>((k + n) % n)] =
              static_cast<float>(window[static_cast<std::size_t>(k + bandBins / 2)]) *
              dsp::fcomplex(static_cast<float>(gauss(rng)), static_cast<float>(gauss(rng)));
        dsp::fft_c(n, n, 1, 1, -2, 0, line);
        const float norm = static_cast<float>(c.clutter_std / std::sqrt(static_cast<double>(bandBins)));
        for (int i = 0; i < n; ++i) line[i] *= norm * static_cast<float>(spread[i]);
        for (const auto& t : c.targets) {
          if (t.swath != s + 1 || t.line < firstLine || t.line > firstLine + c.burst_lines - 1) continue;
          const double az = sinc((gridLine - t.line) * dt * c.azimuth_band);
          for (int i = 0; i < n; ++i) {
            const double v = t.amplitude * az * sinc((i - t.sample) / fs * c.range_band);
            line[i] += std::polar(static_cast<float>(v), static_cast<float>(phase0));
          }
        }
        put_mjd(record, 0, t0 + gridLine * dt);
        record[12] = 0;
        put_int(record, 13, gridLine + 1);
        for (int i = 0; i < n; ++i) {
          auto q = [](float v) {
            return static_cast<int16_t>(std::clamp(std::lround(v), -32768L, 32767L));
          };
          const int16_t re = q(line[i].real()), im = q(line[i].imag());
          base::short2ch(re, reinterpret_cast<unsigned char*>(record.data() + kPrefixBytes + 4 * i), 'm');
          base::short2ch(im, reinterpret_cast<unsigned char*>(record.data() + kPrefixBytes + 4 * i + 2), 'm');
        }
        file.write(record.data(), recordBytes);
      }
    }
  }
  file.close();
  if (!file) throw std::runtime_error("cannot write " + out.path);
  if (c.truncate_mds) std::filesystem::resize_file(out.path, static_cast<uintmax_t>(total - recordBytes * 3));
  return out;
}

}  // namespace sar::simulator

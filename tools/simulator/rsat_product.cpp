#include "simulator/rsat_product.hpp"

#include <algorithm>
#include <cmath>
#include <complex>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <optional>
#include <random>
#include <stdexcept>

#include "base/convert.hpp"
#include "simulator/header_text.hpp"

namespace sar::simulator::rsat {
namespace {

// Sidereal rotation as the leader's readers undo it.
constexpr double kSiderealAngleRate = 1.00273790934 * 7.27220521664304e-05;
constexpr double kSiderealVelocityRate = 7.2921158553e-05;
constexpr double kPulseLength = 4.2e-05;
constexpr double kWindowDelay = 4.2e-06;
constexpr double kWavelength = 0.05656;
constexpr double kAntennaLength = 15.0;
constexpr std::size_t kDataDescriptorBytes = 16444;

void put_be32(std::vector<uint8_t>& b, std::size_t at, uint32_t v) {
  b[at] = static_cast<uint8_t>(v >> 24);
  b[at + 1] = static_cast<uint8_t>(v >> 16);
  b[at + 2] = static_cast<uint8_t>(v >> 8);
  b[at + 3] = static_cast<uint8_t>(v);
}

void put_text(std::vector<uint8_t>& b, std::size_t at, std::size_t width, const std::string& text) {
  for (std::size_t i = 0; i < width; ++i) b[at + i] = i < text.size() ? static_cast<uint8_t>(text[i]) : ' ';
}

std::string fmt(const char* format, double v) {
  char buffer[64];
  std::snprintf(buffer, sizeof buffer, format, v);
  return buffer;
}
std::string fmt_int(int width, long long v) {
  char buffer[32];
  std::snprintf(buffer, sizeof buffer, "%*lld", width, v);
  return buffer;
}

/// A CEOS record of `length` bytes: sequence, four type bytes, length; the rest blank.
std::vector<uint8_t> ceos_record(uint32_t sequence, std::array<uint8_t, 4> type, std::size_t length, uint8_t fill = ' ') {
  std::vector<uint8_t> r(length, fill);
  put_be32(r, 0, sequence);
  std::copy(type.begin(), type.end(), r.begin() + 4);
  put_be32(r, 8, static_cast<uint32_t>(length));
  return r;
}

void write_all(std::ofstream& out, const std::vector<uint8_t>& bytes, const std::string& path) {
  out.write(reinterpret_cast<const char*>(bytes.data()), static_cast<std::streamsize>(bytes.size()));
  if (!out) throw std::runtime_error("cannot write " + path);
}

Vec3 inertial_velocity(const StateVector& s) {
  return s.velocity + Vec3{-kEarthRotation * s.position.y, kEarthRotation * s.position.x, 0.0};
}

/// Sine of the angle between the line of sight and the beam plane (perpendicular to the
/// inertial velocity).
double beam_sine(const StateVector& s, const Vec3& p) { return (p - s.position).unit().dot(inertial_velocity(s).unit()); }

double doppler(const StateVector& s, const Vec3& p) { return 2.0 / kWavelength * (p - s.position).unit().dot(s.velocity); }

/// Beam-centre Doppler at two-way time tau of the unsteered beam at time offset dt: the look
/// direction perpendicular to the inertial velocity meets a sphere of radius `radius`.
double beam_centre_doppler_at(const OrbitModel& orbit, double dt, double tau, double radius) {
  const StateVector s = orbit.state_at_offset(dt);
  const Vec3 along = inertial_velocity(s).unit();
  const Vec3 up = (s.position.unit() - along * s.position.unit().dot(along)).unit();
  const Vec3 right = along.cross(up);
  const double range = 0.5 * kSpeedOfLight * tau, rs = s.position.norm();
  const double cosLook = std::clamp((rs * rs + range * range - radius * radius) / (2.0 * rs * range), -1.0, 1.0);
  const Vec3 look = up * (-cosLook) + right * std::sqrt(1.0 - cosLook * cosLook);
  return 2.0 / kWavelength * look.dot(s.velocity);
}

double sinc(double x) { return std::abs(x) < 1e-12 ? 1.0 : std::sin(kPi * x) / (kPi * x); }

/// Root of f in [a, b] by bisection; f(a) and f(b) must differ in sign.
template <class F>
double bisect(F f, double a, double b) {
  double fa = f(a);
  if ((fa > 0) == (f(b) > 0)) throw std::runtime_error("no beam-centre crossing near the target");
  for (int i = 0; i < 200 && b - a > 1e-10; ++i) {
    const double m = 0.5 * (a + b), fm = f(m);
    if ((fm > 0) == (fa > 0)) {
      a = m;
      fa = fm;
    } else {
      b = m;
    }
  }
  return 0.5 * (a + b);
}

}  // namespace

std::array<uint8_t, 50> encode_aux(const AuxFields& f) {
  std::array<uint8_t, 50> a{};
  a[12] = static_cast<uint8_t>((f.bandwidth_code & 15) << 4);
  a[18] = static_cast<uint8_t>(f.beam_code >> 8);
  a[19] = static_cast<uint8_t>(f.beam_code & 255);
  a[22] = static_cast<uint8_t>((f.adc_code & 3) << 4);
  a[25] = static_cast<uint8_t>((f.pri_count >> 5) & 255);
  a[26] = static_cast<uint8_t>((f.pri_count & 31) << 3);
  a[27] = static_cast<uint8_t>((f.swst_count >> 4) & 255);
  a[28] = static_cast<uint8_t>((f.swst_count & 15) << 4);
  a[29] = static_cast<uint8_t>((f.rx_duration >> 4) & 255);
  a[30] = static_cast<uint8_t>((f.rx_duration & 15) << 4);
  a[44] = static_cast<uint8_t>((f.seconds >> 12) & 31);
  a[45] = static_cast<uint8_t>((f.seconds >> 4) & 255);
  a[46] = static_cast<uint8_t>(((f.seconds & 15) << 4) | ((f.milliseconds >> 6) & 15));
  a[47] = static_cast<uint8_t>(((f.milliseconds & 63) << 2) | ((f.fraction >> 8) & 3));
  a[48] = static_cast<uint8_t>(f.fraction & 255);
  a[49] = static_cast<uint8_t>(f.attenuation & 63);
  return a;
}

uint8_t encode_nibble(float x) {
  const int level = std::clamp(static_cast<int>(std::floor(x)), -8, 7);
  return static_cast<uint8_t>(level >= 0 ? level : level + 16);
}

void write_data_file(const std::string& path, const std::vector<DataRecord>& records, const DataFileOptions& options) {
  std::vector<std::vector<uint8_t>> bodies;
  int64_t longest = 0;
  for (std::size_t r = 0; r < records.size(); ++r) {
    const DataRecord& d = records[r];
    const std::size_t samplesBytes = d.replica.size() + d.echo.size();
    const std::size_t length = 242 + samplesBytes + static_cast<std::size_t>(d.fill);
    std::vector<uint8_t> b = ceos_record(static_cast<uint32_t>(r + 2), {0x32, 0x0A, 0x12, 0x14}, length, 0);
    if (d.length_override >= 0) put_be32(b, 8, static_cast<uint32_t>(d.length_override));
    put_be32(b, 12, static_cast<uint32_t>(d.line_index));
    put_be32(b, 24, static_cast<uint32_t>(samplesBytes / 2));
    const auto aux = encode_aux(d.aux);
    std::copy(aux.begin(), aux.end(), b.begin() + 192);
    std::copy(d.replica.begin(), d.replica.end(), b.begin() + 242);
    std::copy(d.echo.begin(), d.echo.end(), b.begin() + 242 + static_cast<std::ptrdiff_t>(d.replica.size()));
    longest = std::max<int64_t>(longest, static_cast<int64_t>(length));
    bodies.push_back(std::move(b));
  }
  std::vector<uint8_t> fdr = ceos_record(1, {0x3F, 0xC0, 0x12, 0x12}, kDataDescriptorBytes);
  put_text(fdr, 12, 16, "A   CEOS-SAR-CCT");
  const int64_t count = options.announced_records >= 0 ? options.announced_records : static_cast<int64_t>(records.size());
  put_text(fdr, 180, 6, fmt_int(6, count));
  put_text(fdr, 186, 6, fmt_int(6, options.record_length >= 0 ? options.record_length : longest));
  std::ofstream out(path, std::ios::binary | std::ios::trunc);
  if (!out) throw std::runtime_error("cannot write " + path);
  write_all(out, fdr, path);
  for (const auto& b : bodies) write_all(out, b, path);
}

void write_leader(const std::string& path, const LeaderContent& s) {
  std::ofstream out(path, std::ios::binary | std::ios::trunc);
  if (!out) throw std::runtime_error("cannot write " + path);
  std::vector<uint8_t> fdr = ceos_record(1, {0x3F, 0xC0, 0x12, 0x12}, 720);
  put_text(fdr, 12, 16, "A   CEOS-SAR-CCT");
  write_all(out, fdr, path);

  std::vector<uint8_t> dss = ceos_record(2, {0x0A, 0x0A, 0x12, 0x14}, 4096);
  put_text(dss, 20, 16, s.scene_id);
  put_text(dss, 100, 16, s.orbit_configuration);
  put_text(dss, 396, 16, s.mission);
  put_text(dss, 412, 32, s.sensor);
  put_text(dss, 444, 8, s.orbit_number);
  put_text(dss, 1110, 16, s.product_type);
  write_all(out, dss, path);
  write_all(out, ceos_record(3, {0x0A, 0x14, 0x12, 0x14}, 1620), path);  // map projection

  const std::size_t pprLength = std::max<std::size_t>(1024, 386 + 132 * s.positions.size());
  std::vector<uint8_t> ppr = ceos_record(4, {0x0A, 0x1E, 0x12, 0x14}, pprLength);
  put_text(ppr, 12, 32, "ORBITAL KEPLERIAN ELEMENTS");
  put_text(ppr, 140, 4, fmt_int(4, static_cast<long long>(s.positions.size())));
  put_text(ppr, 144, 4, fmt_int(4, s.year));
  put_text(ppr, 148, 4, fmt_int(4, s.month));
  put_text(ppr, 152, 4, fmt_int(4, s.day));
  put_text(ppr, 156, 4, fmt_int(4, s.day_of_year));
  put_text(ppr, 160, 22, fmt("%22.9f", s.seconds_of_day));
  put_text(ppr, 182, 22, fmt("%22.9f", s.interval));
  put_text(ppr, 204, 64, s.frame);
  put_text(ppr, 268, 22, fmt("%22.12f", s.gha_deg));
  for (std::size_t k = 0; k < s.positions.size(); ++k) {
    const std::size_t at = 386 + 132 * k;
    const Vec3& p = s.positions[k];
    const Vec3& v = s.velocities[k];
    const double values[6] = {p.x, p.y, p.z, v.x, v.y, v.z};
    for (int i = 0; i < 6; ++i) put_text(ppr, at + 22 * i, 22, fmt("%22.12f", values[i]));
  }
  write_all(out, ppr, path);
  write_all(out, ceos_record(5, {0x0A, 0x28, 0x12, 0x14}, 1024), path);  // attitude
  write_all(out, ceos_record(6, {0x0A, 0x32, 0x12, 0x14}, 4232), path);  // radiometric
}

LeaderContent leader_from_orbit(const OrbitModel& orbit, double first, int count, double interval, double gha_deg) {
  LeaderContent s;
  const double dayStart = std::floor(first / 86400.0) * 86400.0;
  std::string text;
  if (base::sec852myascii(dayStart, text) != 0) throw std::runtime_error("orbit time before 1985");
  s.year = std::stoi(text.substr(7, 4));
  static const char* kMonths[] = {"JAN", "FEB", "MAR", "APR", "MAY", "JUN", "JUL", "AUG", "SEP", "OCT", "NOV", "DEC"};
  for (int m = 0; m < 12; ++m)
    if (text.compare(3, 3, kMonths[m]) == 0) s.month = m + 1;
  s.day = std::stoi(text.substr(0, 2));
  s.day_of_year = static_cast<int>(std::lround((dayStart - base::ascii2sec85("01-JAN-" + text.substr(7, 4) + " 00:00:00.000000")) / 86400.0)) + 1;
  s.seconds_of_day = first - dayStart;
  s.interval = interval;
  s.gha_deg = gha_deg;
  const double g0 = gha_deg * kPi / 180.0;
  for (int k = 0; k < count; ++k) {
    const StateVector sv = orbit.state(first + k * interval);
    const double theta = g0 + kSiderealAngleRate * k * interval;
    const double c = std::cos(theta), sn = std::sin(theta);
    // Earth-fixed to inertial: the inverse turn, then the frame's rotation added back.
    const Vec3 p{sv.position.x * c - sv.position.y * sn, sv.position.x * sn + sv.position.y * c, sv.position.z};
    const double a = sv.velocity.x * c - sv.velocity.y * sn, b = sv.velocity.x * sn + sv.velocity.y * c;
    const Vec3 v{a - p.y * kSiderealVelocityRate, b + p.x * kSiderealVelocityRate, sv.velocity.z};
    s.positions.push_back(p * 0.001);
    s.velocities.push_back(v);
  }
  return s;
}

BeamSetup beam_setup(const std::string& name) {
  if (name == "F1") return {"F1", 16, 0, 0, 4283, 8, 1.8566e-07, 3.0940000000000004e-08, 30.0e6, 41.0, 2880};
  if (name == "S3") return {"S3", 3, 1, 1, 2447, 8, 3.2491e-07, 5.415e-08, 17.28e6, 41.0, 1644};
  throw std::invalid_argument("unknown RADARSAT-1 beam '" + name + "' (F1 or S3)");
}

RsatTruth simulate_rsat(const RsatConfig& c) {
  if (c.targets.empty()) throw std::invalid_argument("no targets");
  if (c.samples <= 0 || c.samples % 8 != 0) throw std::invalid_argument("samples must be a positive multiple of 8");
  if (c.lines <= 0) throw std::invalid_argument("lines must be positive");
  RsatTruth truth;
  truth.beam = beam_setup(c.beam);
  const BeamSetup& bm = truth.beam;
  const double prf = 1.0 / ((bm.pri_count + 2) * bm.time_unit);
  const double dt = bm.sampling_period;
  const double rate = bm.bandwidth / kPulseLength;
  truth.prf = prf;
  truth.sampling_frequency = 1.0 / dt;
  truth.samples = c.samples;
  truth.lines = c.lines;
  truth.rx_duration = 0;
  while ((6 * truth.rx_duration + 4) / 8 * 8 < c.samples) ++truth.rx_duration;
  if ((6 * truth.rx_duration + 4) / 8 * 8 != c.samples) throw std::invalid_argument("no receive duration gives that many samples");

  // An orbit that sees the first target at zero Doppler at the scene time, with the incidence
  // chosen so that its echo falls in the middle of the window of N pulses in flight.
  const double tScene = base::ascii2sec85(c.scene_time);
  const Vec3 p0 = geodetic_to_ecef(c.targets[0].position);
  const double wantedRange = 0.5 * kSpeedOfLight * (bm.pulses_in_flight + 0.45) / prf;
  double incidence = bm.incidence_deg;
  OrbitModel orbit = OrbitModel::for_scene(c.targets[0].position, tScene, incidence, c.ascending, 12345);
  for (int it = 0; it < 30; ++it) {
    const double range = (p0 - orbit.state(tScene).position).norm();
    if (std::abs(range - wantedRange) < 1.0) break;
    incidence += (wantedRange - range) / 25000.0;  // about 25 km of slant range a degree here
    orbit = OrbitModel::for_scene(c.targets[0].position, tScene, incidence, c.ascending, 12345);
  }

  // Lines centred on the first target's beam-centre crossing; the first line on the 1/1024 ms
  // grid of the time field.
  const double tCross = bisect([&](double t) { return beam_sine(orbit.state(t), p0); }, tScene - 30.0, tScene + 30.0);
  const double tick = 0.0009765625e-3;
  truth.first_line_time = std::round((tCross - 0.5 * c.lines / prf) / tick) * tick;

  // Window: the first target's leading edge a third of the way in.
  const double lead = 2.0 * (p0 - orbit.state(tScene).position).norm() / kSpeedOfLight;
  const double nearWanted = lead - 0.33 * (c.samples * dt - kPulseLength);
  truth.swst_count = static_cast<int>(std::lround((nearWanted + kWindowDelay - bm.pulses_in_flight / prf) / bm.time_unit)) - 5;
  if (truth.swst_count < 0 || truth.swst_count + c.swst_change_counts > 4095)
    throw std::runtime_error("target range outside the sampling window of the beam");
  auto near_time = [&](int w) { return (w + 5) * bm.time_unit - kWindowDelay + bm.pulses_in_flight / prf; };
  truth.near_range_time = near_time(truth.swst_count);

  // Truth of each target.
  for (const Target& t : c.targets) {
    RsatTargetTruth tt;
    tt.target = t;
    tt.ecef = geodetic_to_ecef(t.position);
    tt.zero_doppler_time = orbit.elements().epoch + zero_doppler_offset(orbit, tt.ecef, tScene - orbit.elements().epoch);
    const StateVector s = orbit.state(tt.zero_doppler_time);
    tt.slant_range = (tt.ecef - s.position).norm();
    tt.range_time = 2.0 * tt.slant_range / kSpeedOfLight;
    tt.azimuth_line = (tt.zero_doppler_time - truth.first_line_time) * prf;
    tt.range_sample = (tt.range_time - truth.near_range_time) / dt;
    tt.beam_centre_time = bisect([&](double x) { return beam_sine(orbit.state(x), tt.ecef); }, tt.zero_doppler_time - 30.0,
                                 tt.zero_doppler_time + 30.0);
    tt.doppler_centroid = doppler(orbit.state(tt.beam_centre_time), tt.ecef);
    tt.beam_centre_range_time = 2.0 * (tt.ecef - orbit.state(tt.beam_centre_time).position).norm() / kSpeedOfLight;
    const double h = 0.01;
    tt.doppler_rate = (doppler(orbit.state(tt.zero_doppler_time + h), tt.ecef) -
                       doppler(orbit.state(tt.zero_doppler_time - h), tt.ecef)) / (2.0 * h);
    truth.targets.push_back(tt);
  }
  truth.doppler_centroid = truth.targets[0].doppler_centroid;

  // Replica: the transmitted chirp from its leading edge.
  const int replicaSamples = bm.replica_bytes / 2;
  std::vector<uint8_t> replica(static_cast<std::size_t>(bm.replica_bytes));
  for (int k = 0; k < replicaSamples; ++k) {
    const double u = k * dt;
    std::complex<double> v = 0.0;
    if (u < kPulseLength) v = c.replica_amplitude * std::polar(1.0, kPi * rate * (u - 0.5 * kPulseLength) * (u - 0.5 * kPulseLength));
    replica[2 * k] = encode_nibble(static_cast<float>(v.real()));
    replica[2 * k + 1] = encode_nibble(static_cast<float>(v.imag()));
  }

  // Clutter, made block by block as the lines go by.
  std::optional<ClutterEcho> clutter;
  if (c.clutter.enabled()) {
    ClutterGeometry g;
    g.lines = c.lines;
    g.samples = c.samples;
    g.prf = prf;
    g.sampling_frequency = 1.0 / dt;
    g.carrier_frequency = kSpeedOfLight / kWavelength;
    g.pulse_length = kPulseLength;
    g.chirp_bandwidth = bm.bandwidth;
    g.near_range_time = truth.near_range_time;
    g.antenna_length = kAntennaLength;
    const double midOffset = truth.first_line_time + 0.5 * (c.lines - 1) / prf - orbit.elements().epoch;
    const double radius = p0.norm();
    g.doppler_centroid = [orbit, midOffset, radius](double tau) { return beam_centre_doppler_at(orbit, midOffset, tau, radius); };
    set_orbit_geometry(g, orbit, midOffset, c.targets[0].position.height);
    truth.clutter_centroid_mid = g.doppler_centroid(truth.near_range_time + 0.5 * c.samples * dt);
    clutter.emplace(g, random_reflectivity(c.clutter, g, c.seed ^ 0x5A75A7ull));
  }

  std::mt19937_64 random(c.seed);
  std::normal_distribution<double> normal(0.0, 1.0);
  const double sigma = std::sqrt(0.5 * std::pow(10.0, c.noise_db / 10.0));
  const double lobeLimit = 4.0 * kWavelength / kAntennaLength;
  std::vector<std::complex<double>> echo(static_cast<std::size_t>(c.samples));
  std::vector<DataRecord> records;
  const double dayStart = std::floor(truth.first_line_time / 86400.0) * 86400.0;
  for (int l = 0; l < c.lines; ++l) {
    const double tl = truth.first_line_time + l / prf;
    const int w = truth.swst_count + (c.swst_change_line >= 0 && l >= c.swst_change_line ? c.swst_change_counts : 0);
    const int att = c.attenuation_db + (c.attenuation_step_line >= 0 && l >= c.attenuation_step_line ? c.attenuation_step_db : 0);
    const double tNear = near_time(w);
    std::fill(echo.begin(), echo.end(), 0.0);
    const StateVector s = orbit.state(tl);
    for (const RsatTargetTruth& tt : truth.targets) {
      const double sine = beam_sine(s, tt.ecef);
      if (std::abs(sine) > lobeLimit) continue;
      const double pattern = std::pow(sinc(kAntennaLength * sine / kWavelength), 2);
      const double range = (tt.ecef - s.position).norm();
      const double tau0 = 2.0 * range / kSpeedOfLight;
      const double carrier = -4.0 * kPi * range / kWavelength;
      const int k0 = std::max(0, static_cast<int>(std::ceil((tau0 - tNear) / dt)));
      for (int k = k0; k < c.samples; ++k) {
        const double u = tNear + k * dt - tau0;
        if (u >= kPulseLength) break;
        if (u < 0.0) continue;
        const double x = u - 0.5 * kPulseLength;
        echo[static_cast<std::size_t>(k)] += tt.target.amplitude * pattern * std::polar(1.0, kPi * rate * x * x + carrier);
      }
    }
    if (clutter) {
      // The clutter keeps the first line's window: after an SWST change its samples move.
      const auto cl = clutter->line(l);
      const int shift = static_cast<int>(std::lround((w - truth.swst_count) * bm.time_unit / dt));
      for (int k = 0; k + shift < c.samples; ++k)
        if (k + shift >= 0) echo[static_cast<std::size_t>(k)] += std::complex<double>(cl[static_cast<std::size_t>(k + shift)]);
    }
    const double gain = std::pow(10.0, (c.attenuation_db - att) / 20.0);
    DataRecord rec;
    rec.line_index = l + 1;
    if (l == c.repeated_index_line && l > 0) rec.line_index = l;
    rec.aux.bandwidth_code = bm.bandwidth_code;
    rec.aux.beam_code = bm.beam_code;
    rec.aux.adc_code = bm.adc_code;
    rec.aux.pri_count = bm.pri_count;
    rec.aux.swst_count = w;
    rec.aux.rx_duration = truth.rx_duration;
    rec.aux.attenuation = att;
    const double tod = tl - dayStart;
    const long long ticks = std::llround(tod / tick);
    rec.aux.fraction = static_cast<int>(ticks % 1024);
    rec.aux.milliseconds = static_cast<int>((ticks / 1024) % 1000);
    rec.aux.seconds = static_cast<int>(ticks / 1024000);
    rec.echo.resize(2 * static_cast<std::size_t>(c.samples));
    for (int k = 0; k < c.samples; ++k) {
      const std::complex<double> v = (echo[static_cast<std::size_t>(k)] + std::complex<double>(sigma * normal(random), sigma * normal(random))) * gain;
      rec.echo[2 * k] = encode_nibble(static_cast<float>(v.real()));
      rec.echo[2 * k + 1] = encode_nibble(static_cast<float>(v.imag()));
    }
    if (c.replica_every > 0 && l % c.replica_every == 0) rec.replica = replica;
    if (c.gap_line >= 0 && l >= c.gap_line && l < c.gap_line + c.gap_length) continue;
    records.push_back(std::move(rec));
  }

  std::filesystem::create_directories(c.out_dir);
  truth.leader_path = (std::filesystem::path(c.out_dir) / "lea_01.001").string();
  truth.data_path = (std::filesystem::path(c.out_dir) / "dat_01.001").string();
  truth.truth_path = (std::filesystem::path(c.out_dir) / "truth.txt").string();
  const double mid = truth.first_line_time + 0.5 * c.lines / prf;
  const double firstVector = std::round(mid - 0.5 * (c.vectors - 1) * c.vector_interval);
  LeaderContent leader = leader_from_orbit(orbit, firstVector, c.vectors, c.vector_interval, 123.456789);
  leader.orbit_configuration = c.ascending ? "ASCENDING" : "DESCENDING";
  write_leader(truth.leader_path, leader);
  write_data_file(truth.data_path, records);

  std::ofstream out(truth.truth_path, std::ios::trunc);
  if (!out) throw std::runtime_error("cannot write " + truth.truth_path);
  auto line = [&](const char* key, const std::string& v) { out << key << " = " << v << '\n'; };
  auto num = [&](const char* key, double v) { line(key, fmt("%.12g", v)); };
  auto tim = [&](const char* key, double v) {
    line(key, time_text(v));
    line((std::string(key) + "_sec85").c_str(), fmt("%.9f", v));
  };
  out << "Simulated RADARSAT-1 CEOS raw product: truth of the scene\n\n[product]\n";
  line("leader_file", truth.leader_path);
  line("data_file", truth.data_path);
  line("mode", "RS");
  line("swath", bm.name);
  line("polarization", "H/H");
  out << "\n[acquisition]\n";
  tim("first_line_time", truth.first_line_time);
  num("line_count", c.lines);
  num("prf", prf);
  num("pri_count", bm.pri_count);
  num("swst_code", truth.swst_count);
  num("rx_duration", truth.rx_duration);
  num("line_samples", c.samples);
  num("sampling_frequency", truth.sampling_frequency);
  num("carrier_frequency", kSpeedOfLight / kWavelength);
  num("wavelength", kWavelength);
  num("pulse_length", kPulseLength);
  num("chirp_bandwidth", bm.bandwidth);
  num("swath_rank", bm.pulses_in_flight);
  num("beam_code", bm.beam_code);
  num("near_range_time", truth.near_range_time);
  num("antenna_length", kAntennaLength);
  num("noise_db", c.noise_db);
  num("doppler_centroid", truth.doppler_centroid);
  if (clutter) {
    num("clutter_power_db", c.clutter.power_db);
    num("clutter_doppler_centroid_mid", truth.clutter_centroid_mid);
    num("clutter_ambiguity_mid", std::lround(truth.clutter_centroid_mid / prf));
  }
  num("range_resolution", kSpeedOfLight / (2.0 * bm.bandwidth));
  num("azimuth_resolution", kAntennaLength / 2.0);
  line("echo_convention", "leading edge of the pulse at range_time");
  out << "\n[faults]\n";
  num("gap_line", c.gap_line);
  num("gap_length", c.gap_length);
  num("swst_change_line", c.swst_change_line);
  num("swst_code_after_change", truth.swst_count + c.swst_change_counts);
  num("attenuation_step_line", c.attenuation_step_line);
  num("attenuation_step_db", c.attenuation_step_db);
  num("repeated_index_line", c.repeated_index_line);
  for (std::size_t i = 0; i < truth.targets.size(); ++i) {
    const RsatTargetTruth& tt = truth.targets[i];
    out << "\n[target_" << i + 1 << "]\n";
    num("latitude", tt.target.position.lat_deg);
    num("longitude", tt.target.position.lon_deg);
    num("height", tt.target.position.height);
    num("amplitude", tt.target.amplitude);
    tim("zero_doppler_time", tt.zero_doppler_time);
    num("slant_range", tt.slant_range);
    num("range_time", tt.range_time);
    num("azimuth_line", tt.azimuth_line);
    num("range_sample", tt.range_sample);
    num("doppler_rate", tt.doppler_rate);
    num("doppler_centroid", tt.doppler_centroid);
    tim("beam_centre_time", tt.beam_centre_time);
    num("beam_centre_range_time", tt.beam_centre_range_time);
  }
  if (!out) throw std::runtime_error("cannot write " + truth.truth_path);
  return truth;
}

}  // namespace sar::simulator::rsat

#include "geometry/doppler_geometry.hpp"

#include <cmath>
#include <cstdio>
#include <numbers>

#include "base/diagnostics.hpp"
#include "dsp/linalg.hpp"
#include "dsp/optim.hpp"
#include "geometry/orbit_interp.hpp"

namespace sar::geometry {

namespace {

constexpr double kDegToRad = 1.0 / kDegreesPerRadian;
constexpr double kSearchLimit = 2000.0;  // Hz, the centroid search interval is +-this
constexpr double kSearchTolerance = 0.0001;
constexpr double kEnviStep = 5.0;        // s between the state vectors of the centroid entry
constexpr double kBaselineTauStep = 5e-06;  // s
constexpr const char* kExtrapolationMessage = "Cannot extrapolate orbit out of bounds\n";
// WGS84: a^2, b^2, their doubles and a^2 b^2, the ray's intersection with the ellipsoid.
constexpr double kA2 = 40680631590769.0;
constexpr double kB2 = 40408299984659.16;
constexpr double kA2B2 = 1.6438351648851958e+27;

/// Earth-fixed and frozen-inertial polynomials of five state vectors, in seconds from t0.
struct OrbitPair {
  OrbitPolynomial fixed;   ///< the state vectors as given
  OrbitPolynomial frozen;  ///< turned into the inertial frame of the middle vector's axes
  double t0 = 0.0;
  double mid = 0.0;        ///< polynomial time of the middle vector
};

OrbitPair fit_pair(std::span<const Vec3> sv, double t0, double dt) {
  const std::size_t n = sv.size();
  const double mid = 0.5 * static_cast<double>(n - 1);
  std::vector<Vec3> frozen(n);
  for (std::size_t i = 0; i < n; ++i) {
    // Vector i is given in the Earth-fixed axes of its own epoch, (i - mid) dt after the middle
    // one, which the Earth has turned by that much further: turning the vector forward by the
    // same angle gives its coordinates in the middle vector's axes.
    const double angle = (static_cast<double>(i) - mid) * dt * kEarthRotation;
    const double c = std::cos(angle), s = std::sin(angle);
    frozen[i] = {c * sv[i][0] - s * sv[i][1], s * sv[i][0] + c * sv[i][1], sv[i][2]};
  }
  const int coefficients = static_cast<int>(n);
  return {orb_interp(0.0, sv, dt, coefficients), orb_interp(0.0, frozen, dt, coefficients), t0, mid * dt};
}

/// Columns u, w, r of the local orbital frame of (P, V); false for a degenerate state. The
/// along-track axis is built as (r x v) x r, which stays regular over the equator and the poles.
bool orbital_frame(const Vec3& P, const Vec3& V, Vec3& u, Vec3& w, Vec3& r) {
  r = make_versor(P);
  u = make_versor(cross(cross(P, V), P));
  if (norm(r) == 0.0 || norm(u) == 0.0) return false;
  w = cross(r, u);
  return true;
}

/// Coordinates in the antenna frame of a vector given in the local orbital frame.
Vec3 to_antenna(const Vec3& d, const AttitudeVector& att) {
  const double cy = std::cos(att[kYaw]), sy = std::sin(att[kYaw]);
  const double cp = std::cos(att[kPitch]), sp = std::sin(att[kPitch]);
  const double cr = std::cos(att[kRoll]), sr = std::sin(att[kRoll]);
  const double x1 = d[1] * sy + d[0] * cy, y1 = d[1] * cy - d[0] * sy;
  const double z2 = d[2] * cp - x1 * sp, x2 = x1 * cp + d[2] * sp;
  return {x2, y1 * cr + z2 * sr, z2 * cr - y1 * sr};
}

/// The inverse of to_antenna.
Vec3 from_antenna(const Vec3& d, const AttitudeVector& att) {
  const double cy = std::cos(att[kYaw]), sy = std::sin(att[kYaw]);
  const double cp = std::cos(att[kPitch]), sp = std::sin(att[kPitch]);
  const double cr = std::cos(att[kRoll]), sr = std::sin(att[kRoll]);
  const double y1 = d[1] * cr - d[2] * sr, z2 = d[1] * sr + d[2] * cr;
  const double x1 = d[0] * cp - z2 * sp, z = d[0] * sp + z2 * cp;
  return {x1 * cy - y1 * sy, x1 * sy + y1 * cy, z};
}

bool angles_of(const OrbitPair& orbit, double t, const Vec3& T, const AttitudeVector& att, double& theta,
               double& phi) {
  const double tr = t - orbit.t0;
  Vec3 P{}, V{}, A{};
  POSVELACC_5(tr, orbit.frozen, P, V, A);
  Vec3 u{}, w{}, r{};
  if (!orbital_frame(P, V, u, w, r)) return false;
  const Vec3 S = eval_orbit(orbit.fixed, tr).position;
  // The line of sight is Earth-fixed at tr; the frame is in the middle vector's axes, which the
  // Earth leaves behind by (tr - mid) omega. Both coincide at the middle vector.
  const double angle = (tr - orbit.mid) * kEarthRotation;
  const double c = std::cos(angle), sn = std::sin(angle);
  const Vec3 e = S - T;
  const Vec3 d{c * e[0] - sn * e[1], sn * e[0] + c * e[1], e[2]};
  // M is orthonormal: its inverse is its transpose, which keeps the rounding of a solve away.
  const Vec3 D = to_antenna({dot(u, d), dot(w, d), dot(r, d)}, att);
  const double look = std::atan2(D[1], D[2]);
  theta = att[kElevation] - look;
  // The cross-track extent of D; equal to D[1] / sin(elevation - theta) away from the nadir.
  const double rho = std::hypot(D[1], D[2]);
  phi = std::atan2(D[0], std::cos(theta) * rho) + att[kAzimuthOffset];
  return true;
}

double sinc_pi(double x) {
  const double y = std::numbers::pi * x;
  return y == 0.0 ? 1.0 : std::sin(y) / y;
}

double fdc_search(const OrbitPair& orbit, double t, double tau, const AttitudeVector& att, double wavelength) {
  const double tr = t - orbit.t0;
  const PosVelAcc s = eval_orbit(orbit.fixed, tr);
  auto objective = [&](double f) {
    const RangeDopplerParams params{tau, f, wavelength, 0.0, 1.0, kWgs84A, kWgs84B};
    Vec3 X{};
    double theta = 0.0, phi = 0.0;
    if (gr_pt(s.position, s.velocity, params, X) != geo_status::kOk || !angles_of(orbit, t, X, att, theta, phi))
      return std::numbers::pi;  // no ground point: as far from the beam as an angle can be
    return std::fabs(phi);
  };
  double xmin = 0.0, fmin = 0.0;
  dsp::optim_brOBX(objective, -kSearchLimit, kSearchLimit, kSearchTolerance, xmin, fmin);
  return xmin;
}

double rate_at(const OrbitPair& orbit, double t, double tau, const AttitudeVector& att, double wavelength,
               int& status) {
  const PosVelAcc s = eval_orbit(orbit.fixed, t - orbit.t0);
  const double f = fdc_search(orbit, t, tau, att, wavelength);
  Vec3 X{};
  status = gr_pt(s.position, s.velocity, {tau, f, wavelength, 0.0, 1.0, kWgs84A, kWgs84B}, X);
  if (status != geo_status::kOk) return 0.0;
  const Vec3 D = s.position - X;
  const double r = norm(D);
  const double dv = dot(D, s.velocity);
  return (-1.0 / wavelength) *
         (2.0 * (dot(s.velocity, s.velocity) + dot(D, s.acceleration)) / r - 0.5 * (2.0 * dv) * (2.0 * dv) * std::pow(r * r, -1.5));
}

bool valid_vectors(std::span<const Vec3> sv, double dt) { return sv.size() >= 5 && dt != 0.0; }

int window_poly(bool rate, double t, double tau_ref, std::span<const Vec3> sv, double t0, double dt,
                double wavelength, const PointingLaw& law, int samples, double fs, std::array<double, 3>& coef) {
  if (!valid_vectors(sv, dt) || !(fs > 0.0)) return 10;
  const OrbitPair orbit = fit_pair(sv.first(5), t0, dt);
  Vec3 P{}, V{}, A{};
  POSVELACC_5(t - t0, orbit.frozen, P, V, A);
  const AttitudeVector att = pointing_law(law, Otrulat(P, V));
  SlantWindow window;
  if (!fast_est_spe(P, V, att, samples, fs, window)) return geo_status::kNoIntersection;
  std::array<double, 9> m{};
  std::array<double, 3> y{};
  for (std::size_t i = 0; i < 3; ++i) {
    const double tau = window.near + static_cast<double>(i) * (window.far - window.near) * 0.5;
    int status = 0;
    y[i] = rate ? rate_at(orbit, t, tau, att, wavelength, status) : fdc_search(orbit, t, tau, att, wavelength);
    if (status != 0) return status;
    const double x = tau - tau_ref;
    m[3 * i] = x * x;
    m[3 * i + 1] = x;
    m[3 * i + 2] = 1.0;
  }
  return MSE_poly(m, y, coef);
}

}  // namespace

AttitudeVector pointing_law(const PointingLaw& law, double u) {
  const double p = law.p_deg * kDegToRad;
  const double cu = std::cos(u);
  return {(1.0 - p * p * cu * cu * 0.3333333333333333) * cu * p, std::sin(2.0 * u) * law.q_deg * kDegToRad,
          std::sin(u) * law.r_deg * kDegToRad, law.s_deg * kDegToRad, law.a_rad};
}

// --- Evaluators ------------------------------------------------------------------------------

double POSMACRO(double t, std::span<const double> coef) { return poly_value(t, coef); }
double VELMACRO(double t, std::span<const double> coef) { return poly_rate(t, coef); }
double ACCMACRO(double t, std::span<const double> coef) { return poly_accel(t, coef); }

double pos(double t, std::span<const double> coef) {
  const std::size_t n = coef.size();
  double sum = 0.0;
  for (std::size_t k = 0; k < n; ++k) sum += coef[n - 1 - k] * std::pow(t, static_cast<double>(k));
  return sum;
}

double vel(double t, std::span<const double> coef) {
  const std::size_t n = coef.size();
  double sum = 0.0;
  for (std::size_t k = 1; k < n; ++k)
    sum += static_cast<double>(k) * coef[n - 1 - k] * std::pow(t, static_cast<double>(k - 1));
  return sum;
}

double acc(double t, std::span<const double> coef) {
  const std::size_t n = coef.size();
  double sum = 0.0;
  for (std::size_t k = 2; k < n; ++k)
    sum += static_cast<double>(k * (k - 1)) * coef[n - 1 - k] * std::pow(t, static_cast<double>(k - 2));
  return sum;
}

void POSVELACC_5(double t, const OrbitPolynomial& poly, Vec3& position, Vec3& velocity, Vec3& acceleration) {
  const double t2 = t * t, t3 = t2 * t, t4 = t3 * t;
  const std::vector<double>* axes[3] = {&poly.x, &poly.y, &poly.z};
  for (std::size_t a = 0; a < 3; ++a) {
    const std::vector<double>& c = *axes[a];
    position[a] = c[0] * t4 + c[1] * t3 + c[2] * t2 + c[3] * t + c[4];
    velocity[a] = 4.0 * c[0] * t3 + 3.0 * c[1] * t2 + 2.0 * c[2] * t + c[3];
    acceleration[a] = 12.0 * c[0] * t2 + 6.0 * c[1] * t + 2.0 * c[2];
  }
}

// --- Helpers ---------------------------------------------------------------------------------

double determ(const Mat3& m) {
  return m[0] * (m[4] * m[8] - m[5] * m[7]) - m[1] * (m[3] * m[8] - m[5] * m[6]) + m[2] * (m[3] * m[7] - m[4] * m[6]);
}

int inv3x3(const Mat3& m, Mat3& inverse) {
  const double d = determ(m);
  if (d == 0.0 || !std::isfinite(d)) return 1;
  inverse = {(m[4] * m[8] - m[5] * m[7]) / d, (m[2] * m[7] - m[1] * m[8]) / d, (m[1] * m[5] - m[2] * m[4]) / d,
             (m[5] * m[6] - m[3] * m[8]) / d, (m[0] * m[8] - m[2] * m[6]) / d, (m[2] * m[3] - m[0] * m[5]) / d,
             (m[3] * m[7] - m[4] * m[6]) / d, (m[1] * m[6] - m[0] * m[7]) / d, (m[0] * m[4] - m[1] * m[3]) / d};
  return 0;
}

Mat3 mul3x3(const Mat3& a, const Mat3& b) {
  Mat3 c{};
  mul(a, b, 3, 3, 3, c);
  return c;
}

Vec3 mul3x1(const Mat3& m, const Vec3& v) {
  return {m[0] * v[0] + m[1] * v[1] + m[2] * v[2], m[3] * v[0] + m[4] * v[1] + m[5] * v[2],
          m[6] * v[0] + m[7] * v[1] + m[8] * v[2]};
}

void mul(std::span<const double> a, std::span<const double> b, int n, int m, int p, std::span<double> c) {
  for (std::size_t i = 0; i < static_cast<std::size_t>(n); ++i)
    for (std::size_t j = 0; j < static_cast<std::size_t>(p); ++j) {
      double sum = 0.0;
      for (std::size_t k = 0; k < static_cast<std::size_t>(m); ++k)
        sum += a[i * static_cast<std::size_t>(m) + k] * b[k * static_cast<std::size_t>(p) + j];
      c[i * static_cast<std::size_t>(p) + j] = sum;
    }
}

void mul_NxM_M(std::span<const double> a, std::span<const double> x, int n, int m, std::span<double> y) {
  mul(a, x, n, m, 1, y);
}

void tran(std::span<const double> a, int rows, int cols, std::span<double> t) {
  for (std::size_t i = 0; i < static_cast<std::size_t>(rows); ++i)
    for (std::size_t j = 0; j < static_cast<std::size_t>(cols); ++j)
      t[j * static_cast<std::size_t>(rows) + i] = a[i * static_cast<std::size_t>(cols) + j];
}

double fdc_interp(std::span<const double, 3> c, double x) { return (c[0] * x + c[1]) * x + c[2]; }

Vec3 make_versor(const Vec3& v) { return unit(v); }

double COS_PHI_V(const Vec3& a, const Vec3& b) {
  const double na = norm(a), nb = norm(b);
  if (na == 0.0 || nb == 0.0) return 0.0;
  const double c = dot(a, b) / (na * nb);
  // A rounding below -1 gives 1 as well; callers that need antiparallel vectors use angle_between.
  if (c > 1.0 || c < -1.0) return 1.0;
  return c;
}

int MSE_poly(std::span<const double> M, std::span<const double> y, std::span<double> out) {
  std::array<double, 9> mt{}, mtm{}, inverse{};
  std::array<double, 3> mty{};
  tran(M, 3, 3, mt);
  mul(mt, M, 3, 3, 3, mtm);
  if (int status = dsp::MatInvOBX(mtm, inverse, 3)) return status;
  mul_NxM_M(mt, y, 3, 3, mty);
  mul_NxM_M(inverse, mty, 3, 3, out);
  return 0;
}

// --- Geometry of one state -------------------------------------------------------------------

double rr2th(const Vec3& P, const Vec3& V, const Vec3& X, int flag, double& squint) {
  const double rp = norm(P), rx = norm(X);
  const Vec3 d = P - X;
  const double range = norm(d);
  squint = -std::asin(std::fmax(-1.0, std::fmin(1.0, dot(make_versor(d), make_versor(V))))) * kDegreesPerRadian;
  auto angle = [](double c) { return std::acos(std::fmax(-1.0, std::fmin(1.0, c))) * kDegreesPerRadian; };
  if (flag == 0) return angle((rp * rp + range * range - rx * rx) / (2.0 * rp * range));
  return 180.0 - angle((rx * rx + range * range - rp * rp) / (2.0 * rx * range));
}

double compute_ulat(const Vec3& P, double t, const Vec3& node_position, const Vec3& node_velocity, double node_time) {
  // Into the Earth-fixed axes of the node time, where the node and the present position share
  // one orbit plane.
  const double angle = (t - node_time) * kEarthRotation;
  const double c = std::cos(angle), s = std::sin(angle);
  const Vec3 p{c * P[0] - s * P[1], c * P[1] + s * P[0], P[2]};
  // The angle from the node, robust also at 0 and 180 degrees where an arc cosine is not.
  auto between = [](const Vec3& a, const Vec3& b) { return std::atan2(norm(cross(a, b)), dot(a, b)); };
  const double a1 = between(p, node_position);
  // Behind the node's velocity (more than 90 degrees from it) the satellite is south-bound
  // beyond the top of the orbit, on the half from 180 to 360 degrees.
  const double a2 = between(p, node_velocity);
  return a2 > std::numbers::pi / 2.0 ? -a1 : a1;
}

bool fast_est_spe(const Vec3& P, const Vec3& V, const AttitudeVector& attitude, int samples, double sampling_frequency,
                  SlantWindow& out) {
  Vec3 u{}, w{}, r{};
  if (!orbital_frame(P, V, u, w, r) || !(sampling_frequency > 0.0)) return false;
  const double e = attitude[kElevation], a = attitude[kAzimuthOffset];
  // The boresight of a right-looking antenna, leaving the satellite: forward by the azimuth
  // offset, to the right (-w) and down by the elevation.
  const Vec3 b = from_antenna({std::sin(a), -std::sin(e) * std::cos(a), -std::cos(e) * std::cos(a)}, attitude);
  const Vec3 L = b[0] * u + b[1] * w + b[2] * r;
  const double qa = L[2] * L[2] * kA2 + (L[0] * L[0] + L[1] * L[1]) * kB2;
  const double qb = L[2] * P[2] * 2.0 * kA2 + (L[0] * P[0] + L[1] * P[1]) * 2.0 * kB2;
  const double qc = P[2] * P[2] * kA2 + (P[0] * P[0] + P[1] * P[1]) * kB2 - kA2B2;
  const double disc = qb * qb - 4.0 * qa * qc;
  if (!(disc >= 0.0) || qa == 0.0) return false;
  const double s = (-qb - std::sqrt(disc)) / (2.0 * qa);
  const double tau = norm(s * L) * kTwoWayTimePerMetre;
  const double half = (samples * 0.5) / sampling_frequency;
  out = {tau - half, tau, tau + half};
  return true;
}

bool antenna_angles(double t, const Vec3& T, const AttitudeVector& attitude, std::span<const Vec3> sv, double t0,
                    double dt, double& theta, double& phi) {
  if (!valid_vectors(sv, dt)) return false;
  return angles_of(fit_pair(sv.first(5), t0, dt), t, T, attitude, theta, phi);
}

// --- Centroid and rate -----------------------------------------------------------------------

double fdc_point(double t, double tau, const AttitudeVector& attitude, double wavelength, std::span<const Vec3> sv,
                 double t0, double dt) {
  if (!valid_vectors(sv, dt)) return 0.0;
  return fdc_search(fit_pair(sv.first(5), t0, dt), t, tau, attitude, wavelength);
}

double fm_point(double t, double tau, const AttitudeVector& attitude, double wavelength, std::span<const Vec3> sv,
                double t0, double dt) {
  if (!valid_vectors(sv, dt)) return 0.0;
  int status = 0;
  return rate_at(fit_pair(sv.first(5), t0, dt), t, tau, attitude, wavelength, status);
}

namespace {

int est_doppler(double t, std::span<const Vec3> positions, std::span<const Vec3> velocities, double dt, double tau,
                double wavelength, const PointingLaw& law, double u, double& fdc, AttitudeVector& att) {
  if (!valid_vectors(positions, dt) || velocities.size() < 5) return 10;
  const double t0 = -2.0 * dt;
  const OrbitPair orbit = fit_pair(positions.first(5), t0, dt);
  att = pointing_law(law, u);
  const double f0 = fdc_search(orbit, t, tau, att, wavelength);
  Vec3 X{};
  if (int status = gr_pt(positions[2], velocities[2], {tau, f0, wavelength, 0.0, 1.0, kWgs84A, kWgs84B}, X))
    return status;
  // The elevation through the ground point: the azimuth angle is then read at theta = 0.
  double squint = 0.0;
  att[kElevation] = rr2th(positions[2], velocities[2], X, 0, squint) * kDegToRad;
  fdc = fdc_search(orbit, t, tau, att, wavelength);
  return 0;
}

}  // namespace

int EstDoppler(double t, std::span<const Vec3> positions, std::span<const Vec3> velocities, double dt, double tau,
               double wavelength, const PointingLaw& law, double u, double& fdc) {
  AttitudeVector att{};
  return est_doppler(t, positions, velocities, dt, tau, wavelength, law, u, fdc, att);
}

int predict_doppler(const OrbitData& orbit, double t, double tau, double wavelength, const PointingLaw& law,
                    DopplerPrediction& out) {
  OrbitSamples around, node;
  try {
    around = interpolate_orbit(orbit, t, {5, kEnviStep, true, true});
    node = interpolate_orbit(orbit, around.node_time, {1, 0.0, true, false});
  } catch (const OrbitError& e) {
    return e.status();
  }
  out.node_time = around.node_time;
  for (std::size_t i = 0; i < 5; ++i) {
    out.positions[i] = around.positions[i];
    out.velocities[i] = around.velocities[i];
  }
  out.argument_of_latitude = compute_ulat(out.positions[2], t, node.positions[0], node.velocities[0], out.node_time);
  if (int status = est_doppler(0.0, out.positions, out.velocities, kEnviStep, tau, wavelength, law,
                               out.argument_of_latitude, out.fdc, out.attitude))
    return status;
  int status = 0;
  out.rate = rate_at(fit_pair(out.positions, -2.0 * kEnviStep, kEnviStep), 0.0, tau, out.attitude, wavelength, status);
  return status;
}

int EstDopplerENVI(const OrbitData& orbit, double t, double tau, double /*term1*/, double /*term2*/,
                   double wavelength, double p, double q, double r, double s, double a, double& fdc) {
  base::Frame frame("EstDopplerENVI");
  DopplerPrediction prediction;
  if (int status = frame.check(predict_doppler(orbit, t, tau, wavelength, {p, q, r, s, a}, prediction)))
    return status;
  fdc = prediction.fdc;
  return 0;
}

int EstDopplerENVI(const std::string& orbit_path, double t, double tau, double term1, double term2,
                   double wavelength, double p, double q, double r, double s, double a, double& fdc) {
  base::Frame frame("EstDopplerENVI");
  OrbitData orbit;
  try {
    orbit = read_orbit(orbit_path);
  } catch (const OrbitError& e) {
    return frame.check(e.status());
  }
  return frame.check(EstDopplerENVI(orbit, t, tau, term1, term2, wavelength, p, q, r, s, a, fdc));
}

int centroid_slope(const OrbitData& orbit, double t, double tau_near, double tau_far, double wavelength,
                   const PointingLaw& law, double error_deg, CentroidSlope& out) {
  if (!(tau_far > tau_near) || !(wavelength > 0.0)) return 10;
  DopplerPrediction mid;
  if (int status = predict_doppler(orbit, t, 0.5 * (tau_near + tau_far), wavelength, law, mid)) return status;
  const double t0 = -2.0 * kEnviStep;
  const double fNear = fdc_point(0.0, tau_near, mid.attitude, wavelength, mid.positions, t0, kEnviStep);
  const double fFar = fdc_point(0.0, tau_far, mid.attitude, wavelength, mid.positions, t0, kEnviStep);
  const double span = tau_far - tau_near;
  out.slope = (fFar - fNear) / span;
  // Look angles at the satellite of the swath's edges.
  const Vec3& P = mid.positions[2];
  const Vec3& V = mid.velocities[2];
  double look[2] = {0.0, 0.0};
  const double taus[2] = {tau_near, tau_far};
  for (int k = 0; k < 2; ++k) {
    Vec3 X{};
    if (int status = gr_pt(P, V, {taus[k], 0.0, wavelength, 0.0, 1.0, kWgs84A, kWgs84B}, X)) return status;
    double squint = 0.0;
    look[k] = rr2th(P, V, X, 0, squint) * kDegToRad;
  }
  const double swing = std::fabs(std::sin(look[1]) - std::sin(look[0])) + std::fabs(std::cos(look[1]) - std::cos(look[0]));
  out.tolerance = 2.0 * norm(V) / wavelength * std::sin(error_deg * kDegToRad) * swing / span;
  return 0;
}

int fdc_poly(double t, double tau_ref, std::span<const Vec3> sv, double t0, double dt, double wavelength,
             const PointingLaw& law, int samples, double sampling_frequency, std::array<double, 3>& coef) {
  return window_poly(false, t, tau_ref, sv, t0, dt, wavelength, law, samples, sampling_frequency, coef);
}

int fm_poly(double t, double tau_ref, std::span<const Vec3> sv, double t0, double dt, double wavelength,
            const PointingLaw& law, int samples, double sampling_frequency, std::array<double, 3>& coef) {
  return window_poly(true, t, tau_ref, sv, t0, dt, wavelength, law, samples, sampling_frequency, coef);
}

// --- Gain and baseline -----------------------------------------------------------------------

int gain(std::span<const double> times, const Vec3& target, const AttitudeVector& attitude, double L1, double L2,
         double wavelength, int two_axis, std::span<const Vec3> sv, double t0, double dt, std::span<double> gain_out,
         std::span<double> theta, std::span<double> phi) {
  if (!valid_vectors(sv, dt) || gain_out.size() < times.size() || theta.size() < times.size() ||
      phi.size() < times.size())
    return 10;
  const OrbitPair orbit = fit_pair(sv.first(5), t0, dt);
  for (std::size_t i = 0; i < times.size(); ++i) {
    if (!angles_of(orbit, times[i], target, attitude, theta[i], phi[i])) return 10;
    const double x = sinc_pi((L1 / wavelength) * std::sin(phi[i]));
    double g = x * x;
    if (two_axis == 1) {
      const double y = sinc_pi((L2 / wavelength) * std::sin(theta[i]));
      g *= y * y;
    }
    gain_out[i] = g;
  }
  return 0;
}

int baseline(double t, std::span<const Vec3> master, double dt_master, std::span<const Vec3> slave, double dt_slave,
             double tau, double wavelength, double fdc, double side, BaselineResult& out) {
  out.message.clear();
  if (!valid_vectors(master, dt_master) || !valid_vectors(slave, dt_slave)) return 10;
  const OrbitPolynomial pm = orb_interp(0.0, master.first(5), dt_master, 5);
  const OrbitPolynomial ps = orb_interp(0.0, slave.first(5), dt_slave, 5);
  if (!(t >= 0.0 && t <= 4.0 * dt_master)) {
    out.message = kExtrapolationMessage;
    base::report(base::kReportMessage, out.message);
    return 12;
  }
  const PosVelAcc sm = eval_orbit(pm, t);
  const RangeDopplerParams params{tau, fdc, wavelength, 0.0, side, kWgs84A, kWgs84B};
  Vec3 T{};
  if (int status = gr_pt(sm.position, sm.velocity, params, T)) return status;
  InverseResult inverse;
  if (inv_grpt(slave.first(5), T, dt_slave, wavelength, fdc, inverse) != geo_status::kOk) {
    // The search left the slave's vectors on its way.
    out.message = kExtrapolationMessage;
    base::report(base::kReportMessage, out.message);
    return 13;
  }
  if (!(inverse.time > 0.0 && inverse.time < 4.0 * dt_slave)) {
    char text[96];
    std::snprintf(text, sizeof text, "tSlave out of time bound : %g\n", inverse.time);
    out.message = text;
    base::report(base::kReportMessage, out.message);
    return 13;
  }
  const Vec3 PS = eval_orbit(ps, inverse.time).position;
  RangeDopplerParams further = params;
  further.tau = tau + kBaselineTauStep;
  Vec3 T2{};
  if (int status = gr_pt(sm.position, sm.velocity, further, T2)) return status;
  const Vec3 e1 = make_versor(T - sm.position);
  const Vec3 f = T2 - sm.position;
  const Vec3 e2 = make_versor(f - dot(f, e1) * e1);
  const Vec3 e3 = cross(e1, e2);
  const Vec3 B = PS - sm.position;
  out.parallel = dot(B, e1);
  out.perpendicular = dot(B, e2);
  out.cross = dot(B, e3);
  out.master = sm.position;
  out.slave = PS;
  out.slave_time = inverse.time;
  out.slave_tau = inverse.tau;
  out.target = T;
  return 0;
}

}  // namespace sar::geometry

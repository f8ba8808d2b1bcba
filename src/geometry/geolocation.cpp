#include "geometry/geolocation.hpp"

#include <cmath>
#include <numbers>

#include "geometry/orbit_interp.hpp"

namespace sar::geometry {

namespace {

constexpr int kNewtonMaxSteps = 20;
constexpr double kNewtonStepSquared = 1e-10;     // m^2
constexpr double kNewtonFirstPrevious = 3.4028234663852886e+38;
constexpr double kPlaneDeterminantFloor = 1e-21;
// 2/a^2 and 2/b^2 of WGS84: the surface normal is always taken on WGS84.
constexpr double kNormalXY = 4.916344515294664e-14;
constexpr double kNormalZ = 4.949478203139681e-14;
constexpr double kOmegaSquared = 5.317494393452397e-09;
constexpr double kTwoOmega = 0.00014584230378669142;
constexpr int kInverseRounds = 8;
constexpr double kInverseTimeTolerance = 1e-08;  // s

double det3(const Vec3& r0, const Vec3& r1, const Vec3& r2) { return dot(r0, cross(r1, r2)); }

/// Solve the rows (g0; g1; g2) d = rhs by Cramer's rule; false when singular.
bool cramer(const Vec3& g0, const Vec3& g1, const Vec3& g2, const Vec3& rhs, Vec3& d) {
  const double det = det3(g0, g1, g2);
  if (det == 0.0 || !std::isfinite(det)) return false;
  for (std::size_t k = 0; k < 3; ++k) {
    Vec3 c0 = g0, c1 = g1, c2 = g2;
    c0[k] = rhs[0];
    c1[k] = rhs[1];
    c2[k] = rhs[2];
    d[k] = det3(c0, c1, c2) / det;
  }
  return true;
}

double acos_clamped(double c) { return std::acos(std::fmax(-1.0, std::fmin(1.0, c))); }

constexpr int kHeightPasses = 5;
constexpr double kHeightTolerance = 1e-4;  // m

/// Exact geodetic latitude (rad) and height (m) of X over the ellipsoid (a, b), by fixed point.
void geodetic_height(const Vec3& X, double a, double b, double& lat, double& h) {
  const double e2 = 1.0 - (b * b) / (a * a);
  const double p = std::hypot(X[0], X[1]);
  lat = std::atan2(X[2], p * (1.0 - e2));
  h = 0.0;
  for (int i = 0; i < 10; ++i) {
    const double sl = std::sin(lat);
    const double n = a / std::sqrt(1.0 - e2 * sl * sl);
    h = p > 0.0 ? p / std::cos(lat) - n : std::fabs(X[2]) - b;
    lat = std::atan2(X[2], p * (1.0 - e2 * n / (n + h)));
  }
}

/// Steps shared by both state-vector forms: the point, the raised ellipsoid, heading, lat/lon,
/// incidence and look. Returns the gr_pt status.
int locate_common(grpt_rec& rec, const Vec3& P, const Vec3& V, double a, double b, Vec3& Vi, Vec3& X) {
  Vi = {V[0] - P[1] * kEarthRotation, V[1] + P[0] * kEarthRotation, V[2]};
  RangeDopplerParams params{rec.tau, rec.fdc, rec.wavelength, kEarthRotation, rec.side, a, b};
  int status = gr_pt(P, Vi, params, X);
  if (status != geo_status::kOk) return status;
  if (rec.height != 0.0) {
    // A surface through the target height: the ellipsoid scaled to pass through the point
    // `height` above the present solution's foot (same axis ratio). A scaled ellipsoid is not
    // parallel to the Earth's, so the height it gives drifts with latitude by up to
    // height * e^2; a few passes through the new solution's foot remove that drift.
    const double k = (a / b) * (a / b);
    for (int pass = 0; pass < kHeightPasses; ++pass) {
      double lat = 0.0, h = 0.0;
      geodetic_height(X, a, b, lat, h);
      if (pass > 0 && std::fabs(h - rec.height) <= kHeightTolerance) break;
      const Vec3 q = X + (rec.height - h) * Vec3{std::cos(lat) * X[0] / std::hypot(X[0], X[1]),
                                                 std::cos(lat) * X[1] / std::hypot(X[0], X[1]), std::sin(lat)};
      params.a = std::sqrt(q[0] * q[0] + q[1] * q[1] + k * q[2] * q[2]);
      params.b = std::sqrt(params.a * params.a / k);
      status = gr_pt(P, Vi, params, X);
      if (status != geo_status::kOk) return status;
    }
  }
  rec.x = X[0];
  rec.y = X[1];
  rec.z = X[2];

  const Vec3 n = unit(Vec3{X[0] * kNormalXY, X[1] * kNormalXY, X[2] * kNormalZ});
  const Vec3 u = unit(Vi - dot(Vi, n) * n);
  const double p = std::hypot(X[0], X[1]);
  // Local east; the heading keeps its meaning in both hemispheres of y.
  const Vec3 e = p > 0.0 ? Vec3{-X[1] / p, X[0] / p, 0.0} : Vec3{0.0, 1.0, 0.0};
  Vec3 g = unit(u - dot(u, e) * e);
  if (g[2] < 0.0) g = -1.0 * g;
  rec.heading = acos_clamped(dot(u, g)) * kDegreesPerRadian;
  if (dot(u, e) < 0.0) rec.heading = -rec.heading;

  double lat = 0.0, lon = 0.0;
  xyz2geo(X, lat, lon, a, b);  // geodetic on the Earth's ellipsoid, also above it
  rec.latitude = lat * kDegreesPerRadian;
  rec.longitude = lon * kDegreesPerRadian;

  const Vec3 los = unit(P - X);
  rec.incidence = acos_clamped(dot(unit(X), los)) * kDegreesPerRadian;
  rec.look = acos_clamped(dot(unit(P), los)) * kDegreesPerRadian;
  rec.beam_velocity = 0.0;
  rec.ground_velocity = norm(V) * (norm(X) + rec.height) / norm(P);
  return geo_status::kOk;
}

void clear_outputs(grpt_rec& rec) {
  rec.x = rec.y = rec.z = 0.0;
  rec.latitude = rec.longitude = rec.heading = rec.incidence = rec.look = 0.0;
  rec.ground_velocity = rec.beam_velocity = rec.doppler_rate = 0.0;
}

}  // namespace

int gr_pt0(const Vec3& P, const Vec3& V, const RangeDopplerParams& params, Vec3& X) {
  const double a = params.a, b = params.b, omega = params.omega;
  const double rp = norm(P);
  const double phi = acos_clamped(std::hypot(P[0], P[1]) / rp);
  const double re = std::hypot(a * std::cos(phi), b * std::sin(phi));
  const double range = params.tau * kHalfLightSpeed;
  const Vec3 W{V[0] + omega * P[1], V[1] - omega * P[0], V[2]};
  const double k1 = (re * re + rp * rp - range * range) * 0.5;
  const double k2 = dot(P, V);

  const double d1 = std::fabs(P[2] * W[1] - P[1] * W[2]);
  const double d2 = std::fabs(P[2] * W[0] - P[0] * W[2]);
  const double d3 = std::fabs(P[1] * W[0] - P[0] * W[1]);
  std::size_t f = 1;  // the coordinate left free
  if (d1 > d2 && d1 > d3) f = 0;
  else if (d1 >= d2 || d2 <= d3) f = 2;
  const std::size_t i = (f + 1) % 3, j = (f + 2) % 3;
  const double det = P[i] * W[j] - P[j] * W[i];
  if (std::fabs(det) < kPlaneDeterminantFloor) return geo_status::kSingularPlanes;

  // X = X0 + s Xs with X[f] = s.
  Vec3 x0{}, xs{};
  xs[f] = 1.0;
  x0[i] = (k1 * W[j] - P[j] * k2) / det;
  xs[i] = (-P[f] * W[j] + P[j] * W[f]) / det;
  x0[j] = (P[i] * k2 - W[i] * k1) / det;
  xs[j] = (-P[i] * W[f] + W[i] * P[f]) / det;
  const double qa = dot(xs, xs), qb = dot(x0, xs), qc = dot(x0, x0) - re * re;
  const double disc = qb * qb - qa * qc;
  if (disc < 0.0) return geo_status::kNoIntersection;

  const Vec3 e1 = unit(P);
  const Vec3 e2 = unit(V - dot(V, e1) * e1);
  const Vec3 e3 = cross(e1, e2);  // left of the track
  double s = (std::sqrt(disc) - qb) / qa;
  X = x0 + s * xs;
  if (dot(e3, X) * params.side > 0.0) {
    s = (-qb - std::sqrt(disc)) / qa;
    X = x0 + s * xs;
  }
  return geo_status::kOk;
}

int gr_pt(const Vec3& P, const Vec3& V, const RangeDopplerParams& params, Vec3& X) {
  const int status = gr_pt0(P, V, params, X);
  if (status != geo_status::kOk) return status;
  const double a2 = params.a * params.a, b2 = params.b * params.b;
  const double range = params.tau * kHalfLightSpeed;
  const double k = 2.0 / params.wavelength;
  double previous = kNewtonFirstPrevious;
  for (int step = 0; step < kNewtonMaxSteps; ++step) {
    const Vec3 D = P - X;
    const double r = norm(D);
    const Vec3 W{V[0] + params.omega * X[1], V[1] - params.omega * X[0], V[2]};
    const double dw = dot(D, W);
    const Vec3 rhs{-((X[0] * X[0] + X[1] * X[1]) / a2 + X[2] * X[2] / b2 - 1.0), -(k * dw / r + params.fdc),
                   -(r * r - range * range)};
    const Vec3 g0{2.0 * X[0] / a2, 2.0 * X[1] / a2, 2.0 * X[2] / b2};
    const double r3 = r * r * r;
    const Vec3 g1{k * (D[0] * dw / r3 - W[0] / r), k * (D[1] * dw / r3 - W[1] / r), k * (D[2] * dw / r3 - W[2] / r)};
    const Vec3 g2 = -2.0 * D;
    Vec3 d{};
    if (!cramer(g0, g1, g2, rhs, d)) return geo_status::kSingularPlanes;
    X = X + d;
    const double s = dot(d, d);
    if (s <= kNewtonStepSquared || previous / s <= 2.0) break;
    previous = s;
  }
  return geo_status::kOk;
}

int gr_pt_lat_lon_s(grpt_rec& rec, const Vec3& P, const Vec3& V, double a, double b) {
  Vec3 Vi{}, X{};
  const int status = locate_common(rec, P, V, a, b, Vi, X);
  if (status != geo_status::kOk) return status;
  const double range = rec.tau * kHalfLightSpeed;
  const Vec3 D = P - X;
  const double rp = norm(P);
  const double q = ((P[0] * X[1] - X[0] * P[1]) * kEarthRotation + dot(D, Vi)) / range;
  rec.doppler_rate = (-2.0 / (range * rec.wavelength)) *
                     ((X[0] * P[0] + X[1] * P[1]) * kOmegaSquared + (Vi[0] * X[1] - Vi[1] * X[0]) * kTwoOmega +
                      dot(Vi, Vi) - (kGravityConstant / (rp * rp * rp)) * (rp * rp - dot(X, P)) - q * q);
  return geo_status::kOk;
}

int gr_pt_lat_lon_s_osculated(grpt_rec& rec, const Vec3& P, const Vec3& V, const Vec3& A, double a, double b) {
  Vec3 Vi{}, X{};
  const int status = locate_common(rec, P, V, a, b, Vi, X);
  if (status != geo_status::kOk) return status;
  // Osculating circle of the track: radius rho in the plane of V and A.
  const double v = norm(V);
  const double rho = v * v / norm(A);
  const Vec3 v1 = unit(V), a1 = unit(A);
  const Vec3 n1 = cross(v1, a1), n2 = cross(v1, n1);
  const Vec3 D = P - X;
  const double theta = acos_clamped(dot(D, v1) / norm(D));
  const double st = std::cos(std::numbers::pi / 2.0 - theta);
  const double w = st * norm(D);
  const double psi = std::atan2(dot(n1, D), dot(n2, D));
  rec.doppler_rate = st * st * st * (((-2.0 / rec.wavelength) * (1.0 - ((w / rho) * std::cos(psi) / st) / st) * v * v) / w);
  return geo_status::kOk;
}

grpt_rec zero_doppler_record(std::span<const double, 15> positions, double t0, double dt, double wavelength) {
  grpt_rec rec;
  for (std::size_t k = 0; k < 5; ++k) rec.state_vectors[k] = {positions[3 * k], positions[3 * k + 1], positions[3 * k + 2]};
  rec.t0 = t0;
  rec.dt = dt;
  rec.wavelength = wavelength;
  rec.side = 1.0;
  rec.height = 0.0;
  rec.fdc = 0.0;
  return rec;
}

int gr_pt_lat_lon(grpt_rec& rec, double a, double b) {
  clear_outputs(rec);
  const OrbitPolynomial poly = orb_interp(0.0, rec.state_vectors, rec.dt, 5);
  const double tr = rec.azimuth_time - rec.t0;
  if (tr < -rec.dt / 2.0 || tr > 4.0 * rec.dt + rec.dt / 2.0) return geo_status::kOutOfFit;
  const PosVelAcc s = eval_orbit(poly, tr);
  const int status = gr_pt_lat_lon_s_osculated(rec, s.position, s.velocity, s.acceleration, a, b);
  if (status != geo_status::kOk) return status;
  // Curvature from the acceleration of the fit's origin.
  const Vec3 a0{2.0 * poly.x[2], 2.0 * poly.y[2], 2.0 * poly.z[2]};
  const double v = norm(s.velocity);
  const double rho = v * v / norm(a0);
  rec.beam_velocity = (1.0 - (rec.tau * kHalfLightSpeed * std::cos(rec.look / kDegreesPerRadian)) / rho) * v;
  return geo_status::kOk;
}

namespace {

/// One Newton round of the Doppler equation in t; returns f / g and the range.
template <class Eval>
int inverse_newton(Eval eval, const Vec3& X, double span, double wavelength, double fdc, bool early_exit,
                   InverseResult& out) {
  double t = span * 0.5;
  double r = 0.0;
  const double half = wavelength * fdc * 0.5;
  for (int round = 0; round < kInverseRounds; ++round) {
    if (!(t >= 0.0 && t <= span)) return geo_status::kCannotExtrapolate;
    const PosVelAcc s = eval(t);
    const Vec3& S = s.position;
    const Vec3& Vs = s.velocity;
    const Vec3& As = s.acceleration;
    const Vec3 Vr{Vs[0] - kEarthRotation * S[1], Vs[1] + kEarthRotation * S[0], Vs[2]};
    const Vec3 D = X - S;
    r = norm(D);
    const Vec3 E{-kEarthRotation * X[1] - Vr[0], kEarthRotation * X[0] - Vr[1], -Vs[2]};
    const double f = dot(E, D) + r * half;
    const double g = -E[0] * Vr[0] - E[1] * Vr[1] - E[2] * Vs[2] - dot(D, As) - (dot(D, Vr) * half) / r;
    const double previous = t;
    t -= f / g;
    if (early_exit && std::fabs(t - previous) <= kInverseTimeTolerance) break;
  }
  out.time = t;
  out.tau = r * kTwoWayTimePerMetre;
  return geo_status::kOk;
}

}  // namespace

int inv_grpt_NSV(std::span<const Vec3> state_vectors, const Vec3& X, double dt, double wavelength, double fdc,
                 InverseResult& out) {
  if (state_vectors.size() < 2 || dt == 0.0) return geo_status::kCannotExtrapolate;
  const int n = static_cast<int>(state_vectors.size());
  const OrbitPolynomial poly = orb_interp(0.0, state_vectors, dt, n);
  return inverse_newton([&](double t) { return eval_orbit(poly, t); }, X, (n - 1) * dt, wavelength, fdc, false, out);
}

int inv_grpt(std::span<const Vec3> state_vectors, const Vec3& X, double dt, double wavelength, double fdc,
             InverseResult& out) {
  if (state_vectors.size() < 5) return geo_status::kCannotExtrapolate;
  return inv_grpt_NSV(state_vectors.first(5), X, dt, wavelength, fdc, out);
}

int inv_grpt_opt(const OrbitPolynomial& poly, const Vec3& X, double span, double wavelength, double fdc,
                 InverseResult& out) {
  return inverse_newton([&](double t) { return eval_orbit(poly, t); }, X, span, wavelength, fdc, true, out);
}

int inv_grpt_opt_NSV(const OrbitPolynomial& poly, const Vec3& X, double span, double wavelength, double fdc,
                     InverseResult& out) {
  return inv_grpt_opt(poly, X, span, wavelength, fdc, out);
}

void xyz2geo(const Vec3& X, double& latitude, double& longitude, double a, double b) {
  const double p = std::hypot(X[0], X[1]);
  longitude = std::atan2(X[1], X[0]);
  if (p == 0.0) {  // on the axis: cos(beta) is not exactly 0 in floating point
    latitude = X[2] > 0.0 ? std::numbers::pi / 2.0 : -std::numbers::pi / 2.0;
    return;
  }
  const double beta = std::atan((X[2] / p) * a / b);
  const double cb = std::cos(beta), sb = std::sin(beta);
  // The literal WGS84 axis stands here whatever a is.
  const double den = p - cb * cb * cb * (1.0 - b * b / (a * a)) * 6378137.0;
  if (den == 0.0) {
    latitude = X[2] > 0.0 ? std::numbers::pi / 2.0 : -std::numbers::pi / 2.0;
    return;
  }
  latitude = std::atan((X[2] + sb * sb * sb * (a * a / (b * b) - 1.0) * b) / den);
}

Vec3 geo2cart(double latitude, double longitude, double height) {
  const double cl = std::cos(latitude);
  const double n = (std::sqrt(1.0067394967422765) * 6378137.0) / std::sqrt(cl * cl * 0.006739496742276434 + 1.0);
  return {(n + height) * cl * std::cos(longitude), (n + height) * cl * std::sin(longitude),
          (n * 0.9933056200098587 + height) * std::sin(latitude)};
}

double Otrulat(const Vec3& P, const Vec3& V) {
  constexpr double kMuKm = 398600.47;               // km^3/s^2
  constexpr double kInvMuKm = 2.508777774396503e-06;
  const Vec3 r = 0.001 * P, v = 0.001 * V;
  const double rn = norm(r);
  const double sqmu = std::sqrt(kMuKm);
  const double a = 1.0 / (2.0 / rn - dot(v, v) * kInvMuKm);
  const double e2 = dot(r, v) / sqmu;
  const double sigma = (1.0 / rn - 1.0 / a) * sqmu;
  const double e = std::sqrt(e2 * e2 / a + rn * rn * sigma * sigma * kInvMuKm);
  // Eccentric and mean anomaly of the present point.
  const double e0 = std::atan2(e2 / std::sqrt(a), rn * sigma / sqmu);
  const double mean = e0 - e * std::sin(e0);
  // Argument of latitude from the node line; the perigee is what lies between it and the anomaly.
  const Vec3 h = cross(r, v);
  const Vec3 node{-h[1], h[0], 0.0};
  const Vec3 inPlane = cross(unit(h), unit(node));
  const double ulat = std::atan2(dot(unit(r), inPlane), dot(unit(r), unit(node)));
  const double nu0 = 2.0 * std::atan2(std::sqrt(1.0 + e) * std::sin(e0 / 2.0), std::sqrt(1.0 - e) * std::cos(e0 / 2.0));
  const double perigee = ulat - nu0;
  // Kepler's equation from the mean anomaly: a fixed number of Newton rounds.
  double E = mean;
  for (int round = 0; round < 100; ++round) E -= (E - e * std::sin(E) - mean) / (1.0 - e * std::cos(E));
  const double nu = 2.0 * std::atan(std::tan(E / 2.0) * std::sqrt((1.0 + e) / (1.0 - e)));
  const double u = nu + perigee;
  return std::atan2(std::sin(u), std::cos(u));
}

int geolocate(const OrbitData& orbit, grpt_rec& rec, double sv_step) {
  const OrbitSamples s = interpolate_orbit(orbit, rec.azimuth_time, {5, sv_step, false, false});
  for (std::size_t k = 0; k < 5; ++k) rec.state_vectors[k] = s.positions[k];
  rec.t0 = s.times[0];
  rec.dt = sv_step;
  return gr_pt_lat_lon(rec);
}

}  // namespace sar::geometry

#pragma once
// Doppler centroid, Doppler rate, antenna gain and baseline predicted from orbit and attitude.
//
// Frames. The local orbital frame of a satellite state is the matrix M whose columns are u,
// the along-track unit vector (orthogonal to the position, in the orbit plane, forward), w = r x u
// (left of the track) and r, the radial unit vector; the state is taken inertial, in a frame
// frozen on the Earth-fixed axes of the middle state vector. The attitude turns M into the
// antenna frame: yaw about r, pitch about the new w, roll about the new u. A right-looking
// antenna sees a target under the elevation angle theta (off the boresight elevation, in the
// cross-track plane) and the azimuth angle phi (off the beam centre, positive behind it).
//
// Doppler is f = -(2 / wavelength) dR/dt of a target fixed on the Earth; all positions are
// Earth-fixed metres. Orbit polynomials hold five coefficients per axis unless stated, highest
// power first, in seconds from the first of the state vectors they were fitted to.
//
// Every function is reentrant: the parameters of the centroid search travel with the objective.
#include <array>
#include <span>
#include <string>

#include "geometry/geolocation.hpp"
#include "geometry/orbit_file.hpp"
#include "geometry/orbit_poly.hpp"
#include "geometry/vec3.hpp"

namespace sar::geometry {

/// Attitude vector, radians: yaw, pitch, roll, boresight elevation, boresight azimuth offset.
using AttitudeVector = std::array<double, 5>;
enum AttitudeEntry : std::size_t { kYaw = 0, kPitch = 1, kRoll = 2, kElevation = 3, kAzimuthOffset = 4 };

/// Terms of the pointing law (the defaults are ENVISAT's yaw steering).
struct PointingLaw {
  double p_deg = 3.912987;   ///< yaw amplitude
  double q_deg = -0.167074;  ///< pitch amplitude
  double r_deg = 0.050233;   ///< roll amplitude
  double s_deg = 23.0;       ///< boresight elevation
  double a_rad = 0.0;        ///< boresight azimuth offset, positive forward
};

/// The attitude of the law at the argument of latitude u (rad):
/// yaw = p (1 - p^2 cos^2(u) / 3) cos(u), pitch = q sin(2u), roll = r sin(u).
AttitudeVector pointing_law(const PointingLaw& law, double u);

// --- Orbit polynomial evaluators -------------------------------------------------------------

/// Value, first and second derivative of one axis at t: running powers, extended precision.
double POSMACRO(double t, std::span<const double> coef);
double VELMACRO(double t, std::span<const double> coef);
double ACCMACRO(double t, std::span<const double> coef);
/// The same with one power call per term.
double pos(double t, std::span<const double> coef);
double vel(double t, std::span<const double> coef);
double acc(double t, std::span<const double> coef);
/// All three axes of a five-coefficient polynomial, unrolled (no allocation).
void POSVELACC_5(double t, const OrbitPolynomial& poly, Vec3& position, Vec3& velocity, Vec3& acceleration);

// --- Small helpers -----------------------------------------------------------------------------

/// 3 x 3 matrices, row-major.
using Mat3 = std::array<double, 9>;
double determ(const Mat3& m);
/// Inverse of m; 1 (and `inverse` untouched) when m is singular.
int inv3x3(const Mat3& m, Mat3& inverse);
Mat3 mul3x3(const Mat3& a, const Mat3& b);
Vec3 mul3x1(const Mat3& m, const Vec3& v);
/// Row-major products: c (n x p) = a (n x m) b (m x p), y (n) = a (n x m) x (m); t = transpose.
void mul(std::span<const double> a, std::span<const double> b, int n, int m, int p, std::span<double> c);
void mul_NxM_M(std::span<const double> a, std::span<const double> x, int n, int m, std::span<double> y);
void tran(std::span<const double> a, int rows, int cols, std::span<double> t);
/// c[0] x^2 + c[1] x + c[2].
double fdc_interp(std::span<const double, 3> c, double x);
/// Unit vector of v; a zero vector yields a zero vector.
Vec3 make_versor(const Vec3& v);
/// Cosine of the angle between a and b; 0 if either is zero; 1 for a rounding beyond -1 or +1.
double COS_PHI_V(const Vec3& a, const Vec3& b);
/// Least squares (M^T M)^-1 M^T y for a 3 x 3 row-major M; status of the matrix inverse.
int MSE_poly(std::span<const double> M, std::span<const double> y, std::span<double> out);

// --- Geometry of one state -----------------------------------------------------------------------

/// Look angle (degrees) of the target X from the satellite at P: with flag 0 at the satellite
/// against the geocentric vertical, otherwise 180 minus the angle at the target. `squint`
/// receives -asin(unit(P - X) . unit(V)) in degrees.
double rr2th(const Vec3& P, const Vec3& V, const Vec3& X, int flag, double& squint);

/// Argument of latitude (rad, -pi .. pi) of the Earth-fixed position P at time t, from the
/// ascending node's Earth-fixed position and velocity at node_time (same time scale as t).
double compute_ulat(const Vec3& P, double t, const Vec3& node_position, const Vec3& node_velocity, double node_time);

/// Two-way slant times of the near edge, the boresight and the far edge of a window of
/// `samples` at `sampling_frequency`, centred on the boresight's intersection with WGS84.
/// P, V inertial; returns false (outputs untouched) when the boresight misses the Earth.
struct SlantWindow {
  double near = 0.0, centre = 0.0, far = 0.0;
};
bool fast_est_spe(const Vec3& P, const Vec3& V, const AttitudeVector& attitude, int samples, double sampling_frequency,
                  SlantWindow& out);

/// Elevation (theta) and azimuth (phi) angles, radians, of the target T at polynomial time t
/// for five Earth-fixed state vectors `sv` spaced dt from t0. Returns false when the state is
/// degenerate (zero position or velocity).
bool antenna_angles(double t, const Vec3& T, const AttitudeVector& attitude, std::span<const Vec3> sv, double t0,
                    double dt, double& theta, double& phi);

// --- Centroid and rate --------------------------------------------------------------------------

/// Doppler (Hz) in -2000 .. 2000 at which the ground point at two-way time tau lies on the beam
/// centre, at time t (same time axis as t0; five state vectors spaced dt from t0).
double fdc_point(double t, double tau, const AttitudeVector& attitude, double wavelength, std::span<const Vec3> sv,
                 double t0, double dt);
/// Doppler rate (Hz/s) of the target at the beam centre, same arguments.
double fm_point(double t, double tau, const AttitudeVector& attitude, double wavelength, std::span<const Vec3> sv,
                double t0, double dt);

/// Centroid from five state vectors (positions and velocities) spaced dt, the middle one at
/// time 0, for the query time t (normally 0), the argument of latitude u and the law. The
/// elevation of the law is replaced by the look angle of the first estimate's ground point, so
/// that the azimuth angle is measured at the boresight elevation. Status 0 or gr_pt's.
int EstDoppler(double t, std::span<const Vec3> positions, std::span<const Vec3> velocities, double dt, double tau,
               double wavelength, const PointingLaw& law, double u, double& fdc);

/// What the orbit file predicts at one (t, tau).
struct DopplerPrediction {
  double fdc = 0.0;             ///< Hz, absolute
  double rate = 0.0;            ///< Hz/s
  double argument_of_latitude = 0.0;  ///< rad
  double node_time = 0.0;       ///< sec85 of the ascending node
  AttitudeVector attitude{};    ///< the law at u with the elevation of the final search
  std::array<Vec3, 5> positions{}, velocities{};  ///< state vectors 5 s apart, centred on t
};

/// Centroid and rate at azimuth time t (sec85) and two-way time tau. Status 0; the orbit
/// layer's 12 or 13 (t outside the orbit), 1 (no ascending node before t); gr_pt's status.
int predict_doppler(const OrbitData& orbit, double t, double tau, double wavelength, const PointingLaw& law,
                    DopplerPrediction& out);

/// The centroid entry of the jobs: orbit file, azimuth time t (sec85), two-way time tau, then
/// the attitude law terms: two terms carried for the callers (1.0 and 10.0; they do not enter the
/// centroid), the wavelength, p, q, r, s (degrees) and the azimuth offset a (rad). Status as
/// predict_doppler, or the orbit reader's for a file it cannot read.
int EstDopplerENVI(const std::string& orbit_path, double t, double tau, double term1, double term2, double wavelength,
                   double p, double q, double r, double s, double a, double& fdc);
int EstDopplerENVI(const OrbitData& orbit, double t, double tau, double term1, double term2, double wavelength,
                   double p, double q, double r, double s, double a, double& fdc);

/// Range slope of the centroid across a swath, in Hz per second of two-way time.
struct CentroidSlope {
  double slope = 0.0;      ///< what the orbit and the law predict between the swath's edges
  double tolerance = 0.0;  ///< the largest change of it that an attitude error can bring
};
/// The slope between the two-way times tau_near and tau_far at azimuth time t (sec85), and
/// its tolerance for errors of up to error_deg in yaw and in pitch: a beam turned by yaw dy and
/// pitch dp sees the centroid (2 V / wavelength)(dy sin g - dp cos g) at the look angle g, so
/// across the swath the slope can change by (2 V / wavelength) sin(error) (|d sin g| + |d cos g|)
/// over the swath's two-way time. Status as predict_doppler, or gr_pt's.
int centroid_slope(const OrbitData& orbit, double t, double tau_near, double tau_far, double wavelength,
                   const PointingLaw& law, double error_deg, CentroidSlope& out);

/// Centroid or rate against slant time across a window: three coefficients (highest power
/// first) in x = slant time - tau_ref, through the near edge, the middle and the far edge of
/// the boresight window of `samples` at `sampling_frequency`. Status 0, 2 when the boresight
/// misses the Earth, or the matrix inverse's.
int fdc_poly(double t, double tau_ref, std::span<const Vec3> sv, double t0, double dt, double wavelength,
             const PointingLaw& law, int samples, double sampling_frequency, std::array<double, 3>& coef);
int fm_poly(double t, double tau_ref, std::span<const Vec3> sv, double t0, double dt, double wavelength,
            const PointingLaw& law, int samples, double sampling_frequency, std::array<double, 3>& coef);

// --- Gain and baseline --------------------------------------------------------------------------

/// Two-way power pattern of a uniform antenna at the target for each time (polynomial times):
/// sinc^2(L1 sin(phi) / wavelength), times sinc^2(L2 sin(theta) / wavelength) when two_axis is 1.
/// 1 at the boresight. gain, theta, phi receive one value per time. Status 0; 10 for outputs
/// shorter than `times` or a degenerate state.
int gain(std::span<const double> times, const Vec3& target, const AttitudeVector& attitude, double L1, double L2,
         double wavelength, int two_axis, std::span<const Vec3> sv, double t0, double dt, std::span<double> gain_out,
         std::span<double> theta, std::span<double> phi);

struct BaselineResult {
  double parallel = 0.0;       ///< along the master's line of sight, m
  double perpendicular = 0.0;  ///< across it in the range plane, m
  double cross = 0.0;          ///< normal to the range plane, m
  Vec3 master{}, slave{};      ///< positions, m
  double slave_time = 0.0;     ///< polynomial time of the slave, s
  double slave_tau = 0.0;      ///< two-way slant time seen from the slave, s
  Vec3 target{};
  std::string message;         ///< the failure message of status 12 or 13
};

/// Interferometric baseline at master time t (polynomial time of the five master vectors,
/// spaced dt_master) for the target at (tau, fdc) on `side`. Status 0; 12 "Cannot extrapolate
/// orbit out of bounds\n" for t outside 0 .. 4 dt_master; 13 when the slave never sees the
/// target inside its vectors ("tSlave out of time bound : %g\n" when found outside).
int baseline(double t, std::span<const Vec3> master, double dt_master, std::span<const Vec3> slave, double dt_slave,
             double tau, double wavelength, double fdc, double side, BaselineResult& out);

}  // namespace sar::geometry

#pragma once
// Scene polynomials: quantities that vary over a scene (Doppler centroid, Doppler rate, slant to
// ground range and back, slant range to look and azimuth angle), each a small polynomial in a
// range coordinate r and an azimuth coordinate a around a reference point:
//
//   p(r, a) = c0 + c1 r + c2 a + c3 a r + c4 r^2 + c5 r^3 + c6 r^4,
//   r = range - trg0_s, a = azimuth - taz0_s.
//
// A scene carries a set of such polynomials along azimuth; polySAR holds six sets and evaluates
// them either with the polynomial whose azimuth reference is the last one at or before the
// query, or with coefficients interpolated in azimuth between neighbours.
//
// In files, a polynomial is the section "PolySAR/<name>" with the elements "pol" (seven
// values), "trg0_s" and "taz0_s"; the set counts are the section "PolySAR" and the members
// "PolySAR/<name>-<index>". Range is a time for the Doppler sets; the geometric sets use the
// unit of their conversion (two-way slant time in seconds against metres or degrees).
#include <array>
#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

#include "metadata/base_xml.hpp"

namespace sar::metadata {

/// Number of coefficients of a scene polynomial.
inline constexpr int kPolyCoefficients = 7;
/// Largest set size a header may ask for.
inline constexpr int kMaxPolysInSet = 100000;
/// Status of a request to an empty set (also of rejected input).
inline constexpr int kPolyRejected = 10;

class poly : public GeneralSAR_BaseXML {
 public:
  std::array<double, kPolyCoefficients> pol{};
  double trg0_s = 0.0;
  double taz0_s = 0.0;

  poly() = default;
  poly(const std::array<double, kPolyCoefficients>& coefficients, double rangeRef, double azimuthRef)
      : pol(coefficients), trg0_s(rangeRef), taz0_s(azimuthRef) {}

  int refreshParameters() override;

  /// Value at (range, azimuth); 0.
  int EvaluatePoly(double range, double azimuth, double& out) const;
  double value(double range, double azimuth) const;

  /// Section name of this kind of polynomial (without the "PolySAR/" prefix).
  virtual const char* sectionName() const { return "Poly"; }

  /// Writes the polynomial to section "PolySAR/<section>" of `file` (dialect of the file; new
  /// files are XML). 0 or 1.
  int writepar(const std::string& file, std::string_view section);
  /// Reads section "PolySAR/<section>": the XML header first, then the profile text (with the
  /// older keys of the kinds that have them). 0 or 1.
  int readpar(const std::string& file, std::string_view section);

  int writehdr(const std::string& path) override { return writepar(path, sectionName()); }
  int readhdr(const std::string& path) override { return readpar(path, sectionName()); }

 protected:
  /// The older profile keys of the kind: coefficients, range reference, azimuth reference.
  /// Empty names: none.
  virtual std::array<const char*, 3> olderKeys() const { return {nullptr, nullptr, nullptr}; }
  /// Profile text fallback of readpar.
  int readProfileFallback(const std::string& file, std::string_view section);
  /// The oldest layout: one nine-value key in the layout a0..a8 of the stripmap Doppler
  /// polynomials (seven coefficients, then range and azimuth reference).
  int readNineValueKey(const std::string& file, std::string_view section, const char* key);
};

/// Doppler centroid (Hz) against two-way range time and azimuth time.
class polyDC : public poly {
 public:
  using poly::poly;
  const char* sectionName() const override { return "DopplerCentroid"; }
  /// The oldest layout: key "DCpoly" with nine values in `section` of a profile file.
  int readparold(const std::string& file, std::string_view section) {
    return readNineValueKey(file, section, "DCpoly");
  }

 protected:
  std::array<const char*, 3> olderKeys() const override { return {"DCpoly", "DCpoly_rgt0", "DCpoly_azt0"}; }
};

/// Doppler rate (Hz/s) against two-way range time and azimuth time.
class polyFR : public poly {
 public:
  using poly::poly;
  const char* sectionName() const override { return "DopplerRate"; }
  /// The oldest layout: key "FRpoly" with nine values in `section` of a profile file.
  int readparold(const std::string& file, std::string_view section) {
    return readNineValueKey(file, section, "FRpoly");
  }
};

class polySL2GR : public poly {
 public:
  using poly::poly;
  const char* sectionName() const override { return "SlantToGround"; }
};

class polyGR2SL : public poly {
 public:
  using poly::poly;
  const char* sectionName() const override { return "GroundToSlant"; }
};

class polySL2THETA : public poly {
 public:
  using poly::poly;
  const char* sectionName() const override { return "SlantToTheta"; }
};

class polySL2PHI : public poly {
 public:
  using poly::poly;
  const char* sectionName() const override { return "SlantToPhi"; }
};

class polySAR : public GeneralSAR_BaseXML {
 public:
  int32_t ndc = 0;
  int32_t nfr = 0;
  int32_t nsl2gr = 0;
  int32_t ngr2sl = 0;
  int32_t nsl2theta = 0;
  int32_t nsl2phi = 0;
  std::vector<polyDC> dc;
  std::vector<polyFR> fr;
  std::vector<polySL2GR> sl2gr;
  std::vector<polyGR2SL> gr2sl;
  std::vector<polySL2THETA> sl2theta;
  std::vector<polySL2PHI> sl2phi;

  int refreshParameters() override;

  /// Allocates the six sets (cleared polynomials); negative or oversized counts give 10.
  int CreatePolys(int nDC, int nFR, int nSL2GR, int nGR2SL, int nSL2THETA, int nSL2PHI);
  /// The older form: Doppler centroid and rate sets only.
  int CreatePolys(int nDC, int nFR);
  void DestroyPolys();

  // Nearest-below selection; 10 with "NO <X> poly available" for an empty set.
  int EvaluateDC(double range, double azimuth, double& out) const;
  int EvaluateFR(double range, double azimuth, double& out) const;
  int EvaluateSL2GR(double range, double azimuth, double& out) const;
  int EvaluateGR2SL(double range, double azimuth, double& out) const;
  int EvaluateSL2THETA(double range, double azimuth, double& out) const;
  int EvaluateSL2PHI(double range, double azimuth, double& out) const;

  // Coefficients at the query azimuth (interpolated for DC and FR, selected for the others),
  // evaluated with the azimuth reference at the query and the range reference of the selected
  // polynomial.
  int EvaluateDCinterp(double range, double azimuth, double& out) const;
  int EvaluateFRinterp(double range, double azimuth, double& out) const;
  int EvaluateSL2GRinterp(double range, double azimuth, double& out) const;
  int EvaluateGR2SLinterp(double range, double azimuth, double& out) const;
  int EvaluateSL2THETAinterp(double range, double azimuth, double& out) const;
  int EvaluateSL2PHIinterp(double range, double azimuth, double& out) const;

  // Seven coefficients at an azimuth: linear interpolation (and extrapolation from the two end
  // polynomials) for DC and FR, the selected polynomial's for the others.
  int getDCpoly(double azimuth, std::array<double, kPolyCoefficients>& out) const;
  int getFRpoly(double azimuth, std::array<double, kPolyCoefficients>& out) const;
  int getSL2GRpoly(double azimuth, std::array<double, kPolyCoefficients>& out) const;
  int getGR2SLpoly(double azimuth, std::array<double, kPolyCoefficients>& out) const;
  int getSL2THETApoly(double azimuth, std::array<double, kPolyCoefficients>& out) const;
  int getSL2PHIpoly(double azimuth, std::array<double, kPolyCoefficients>& out) const;

  // Index of the selected polynomial.
  int getDCnum(double azimuth, int& index) const;
  int getFRnum(double azimuth, int& index) const;
  int getSL2GRnum(double azimuth, int& index) const;
  int getGR2SLnum(double azimuth, int& index) const;
  int getSL2THETAnum(double azimuth, int& index) const;
  int getSL2PHInum(double azimuth, int& index) const;

  /// Counts in section "PolySAR", then every polynomial in "PolySAR/<name>-<index>".
  int writehdr(const std::string& path) override;
  /// Reads the counts, allocates, reads every polynomial. 0 or 1 (10 for impossible counts).
  int readhdr(const std::string& path) override;
  int clone(const polySAR& other);

 private:
  /// Brings the counts in line with the sets.
  void syncCounts();
};

}  // namespace sar::metadata

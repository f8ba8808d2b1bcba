#include "metadata/poly_sar.hpp"

#include <cstdio>
#include <span>

#include "base/diagnostics.hpp"
#include "base/profile.hpp"

namespace sar::metadata {

namespace {

constexpr const char* kPolySarSection = "PolySAR";

std::string poly_path(std::string_view section) {
  char text[512];
  std::snprintf(text, sizeof text, "%s/%.*s", kPolySarSection, static_cast<int>(section.size()), section.data());
  return text;
}

std::string member_name(const char* setSection, int index) {
  char text[256];
  std::snprintf(text, sizeof text, "%s-%d", setSection, index);
  return text;
}

bool profile_has(const std::string& file, std::string_view section, std::string_view key) {
  return sar::base::GetSetProfileChar(0, section, key, {}, file) != nullptr;
}

/// Index of the last polynomial whose azimuth reference is at or before the query; the first
/// one for queries before it. The set is not empty.
template <class P>
int select_index(const std::vector<P>& set, double azimuth) {
  int k = 0;
  const int n = static_cast<int>(set.size());
  if (azimuth <= set[0].taz0_s) return 0;
  while (k + 1 < n && set[static_cast<size_t>(k + 1)].taz0_s <= azimuth) ++k;
  return k;
}

template <class P>
int empty_set(const std::vector<P>& set, const char* name) {
  if (!set.empty()) return 0;
  char text[64];
  std::snprintf(text, sizeof text, "NO %s poly available", name);
  sar::base::report(sar::base::kReportError, text);
  return kPolyRejected;
}

template <class P>
int evaluate_selected(const std::vector<P>& set, const char* name, double range, double azimuth, double& out) {
  if (int st = empty_set(set, name)) return st;
  return set[static_cast<size_t>(select_index(set, azimuth))].EvaluatePoly(range, azimuth, out);
}

template <class P>
int selected_number(const std::vector<P>& set, const char* name, double azimuth, int& index) {
  if (int st = empty_set(set, name)) return st;
  index = select_index(set, azimuth);
  return 0;
}

template <class P>
int selected_coefficients(const std::vector<P>& set, const char* name, double azimuth,
                          std::array<double, kPolyCoefficients>& out) {
  if (int st = empty_set(set, name)) return st;
  out = set[static_cast<size_t>(select_index(set, azimuth))].pol;
  return 0;
}

/// c = (1 - w) a + w b.
std::array<double, kPolyCoefficients> blend(const std::array<double, kPolyCoefficients>& a,
                                            const std::array<double, kPolyCoefficients>& b, double w) {
  std::array<double, kPolyCoefficients> c{};
  for (int i = 0; i < kPolyCoefficients; ++i)
    c[static_cast<size_t>(i)] = (1.0 - w) * a[static_cast<size_t>(i)] + w * b[static_cast<size_t>(i)];
  return c;
}

/// Linear interpolation of the coefficients in azimuth; beyond the ends, linear extrapolation
/// from the two end polynomials. Polynomials that share an azimuth reference give the earlier.
template <class P>
int interpolated_coefficients(const std::vector<P>& set, const char* name, double azimuth,
                              std::array<double, kPolyCoefficients>& out) {
  if (int st = empty_set(set, name)) return st;
  const size_t n = set.size();
  if (n == 1) {
    out = set[0].pol;
    return 0;
  }
  const P& first = set[0];
  const P& last = set[n - 1];
  if (azimuth >= last.taz0_s) {
    const P& prev = set[n - 2];
    const double span = last.taz0_s - prev.taz0_s;
    const double w = span != 0.0 ? (azimuth - last.taz0_s) / span : 0.0;
    out = blend(last.pol, prev.pol, -w);  // (1 + w) c_n - w c_n-1
    return 0;
  }
  if (azimuth < first.taz0_s) {
    const P& next = set[1];
    const double span = next.taz0_s - first.taz0_s;
    const double w = span != 0.0 ? (first.taz0_s - azimuth) / span : 0.0;
    out = blend(first.pol, next.pol, -w);  // (1 + w) c_0 - w c_1
    return 0;
  }
  size_t k = 0;
  while (k + 2 < n && set[k + 1].taz0_s <= azimuth) ++k;
  const double span = set[k + 1].taz0_s - set[k].taz0_s;
  const double w = span != 0.0 ? (azimuth - set[k].taz0_s) / span : 0.0;
  out = blend(set[k].pol, set[k + 1].pol, w);
  return 0;
}

/// Evaluates the coefficients at the query with the azimuth reference at the query and the
/// range reference of the selected polynomial.
template <class P>
int evaluate_at_query(const std::vector<P>& set, const char* name, double range, double azimuth, double& out,
                      const std::array<double, kPolyCoefficients>& coefficients) {
  int index = 0;
  if (int st = selected_number(set, name, azimuth, index)) return st;
  const poly temporary(coefficients, set[static_cast<size_t>(index)].trg0_s, azimuth);
  return temporary.EvaluatePoly(range, azimuth, out);
}

template <class P>
int write_set(std::vector<P>& set, const std::string& path) {
  for (size_t i = 0; i < set.size(); ++i) {
    P& p = set[i];
    if (p.writepar(path, member_name(p.sectionName(), static_cast<int>(i))) != 0) return 1;
  }
  return 0;
}

template <class P>
int read_set(std::vector<P>& set, const std::string& path) {
  for (size_t i = 0; i < set.size(); ++i) {
    P& p = set[i];
    if (p.readpar(path, member_name(p.sectionName(), static_cast<int>(i))) != 0) return 1;
  }
  return 0;
}

}  // namespace

// ---- poly ---------------------------------------------------------------------------------

int poly::refreshParameters() {
  createElementsVector(3);
  int st = addElementDouble("pol", pol.data(), kPolyCoefficients, 0.0, 0.0, true);
  st |= addElementDouble("trg0_s", &trg0_s, 1, 0.0, 0.0, true);
  st |= addElementDouble("taz0_s", &taz0_s, 1, 0.0, 0.0, true);
  return st;
}

double poly::value(double range, double azimuth) const {
  const double r = range - trg0_s;
  const double a = azimuth - taz0_s;
  return (((pol[6] * r + pol[5]) * r + pol[4]) * r + pol[3] * a + pol[1]) * r + pol[2] * a + pol[0];
}

int poly::EvaluatePoly(double range, double azimuth, double& out) const {
  out = value(range, azimuth);
  return 0;
}

int poly::writepar(const std::string& file, std::string_view section) {
  if (file.empty() || section.empty()) return 1;
  return writeSection(file, 1, poly_path(section));
}

int poly::readpar(const std::string& file, std::string_view section) {
  if (file.empty() || section.empty()) return 1;
  switch (header_dialect(file)) {
    case HeaderDialect::kXml:
      return readAuxiliaryFile(file, 1, poly_path(section));
    case HeaderDialect::kProfile:
      return readProfileFallback(file, section);
    case HeaderDialect::kMissing:
    case HeaderDialect::kOtherXml:
      break;
  }
  return 1;
}

int poly::readProfileFallback(const std::string& file, std::string_view section) {
  const std::string path = poly_path(section);
  if (profile_has(file, path, "pol")) return readProfileSection(file, path);
  const auto keys = olderKeys();
  if (keys[0] == nullptr || !profile_has(file, section, keys[0])) return 1;
  using namespace sar::base;
  std::array<double, kPolyCoefficients> c{};
  double rg = 0.0;
  double az = 0.0;
  if (GetProfileDoubleArray(section, keys[0], c, file) != kProfileOk ||
      GetProfileDoubleArray(section, keys[1], {&rg, 1}, file) != kProfileOk ||
      GetProfileDoubleArray(section, keys[2], {&az, 1}, file) != kProfileOk) {
    return 1;
  }
  pol = c;
  trg0_s = rg;
  taz0_s = az;
  return 0;
}

int poly::readNineValueKey(const std::string& file, std::string_view section, const char* key) {
  if (header_dialect(file) != HeaderDialect::kProfile) return 1;
  std::array<double, 9> a{};
  if (sar::base::GetProfileDoubleArray(section, key, a, file) != sar::base::kProfileOk) return 1;
  for (int i = 0; i < kPolyCoefficients; ++i) pol[static_cast<size_t>(i)] = a[static_cast<size_t>(i)];
  trg0_s = a[7];
  taz0_s = a[8];
  return 0;
}

// ---- polySAR ------------------------------------------------------------------------------

int polySAR::refreshParameters() {
  syncCounts();
  createElementsVector(6);
  int st = 0;
  st |= addElementInt("ndc", &ndc, 1, 0.0, kMaxPolysInSet, true);
  st |= addElementInt("nfr", &nfr, 1, 0.0, kMaxPolysInSet, true);
  st |= addElementInt("nsl2gr", &nsl2gr, 1, 0.0, kMaxPolysInSet, true);
  st |= addElementInt("ngr2sl", &ngr2sl, 1, 0.0, kMaxPolysInSet, true);
  st |= addElementInt("nsl2theta", &nsl2theta, 1, 0.0, kMaxPolysInSet, true);
  st |= addElementInt("nsl2phi", &nsl2phi, 1, 0.0, kMaxPolysInSet, true);
  return st;
}

void polySAR::syncCounts() {
  ndc = static_cast<int32_t>(dc.size());
  nfr = static_cast<int32_t>(fr.size());
  nsl2gr = static_cast<int32_t>(sl2gr.size());
  ngr2sl = static_cast<int32_t>(gr2sl.size());
  nsl2theta = static_cast<int32_t>(sl2theta.size());
  nsl2phi = static_cast<int32_t>(sl2phi.size());
}

int polySAR::CreatePolys(int nDC, int nFR, int nSL2GR, int nGR2SL, int nSL2THETA, int nSL2PHI) {
  for (int n : {nDC, nFR, nSL2GR, nGR2SL, nSL2THETA, nSL2PHI}) {
    if (n < 0 || n > kMaxPolysInSet) return kPolyRejected;
  }
  DestroyPolys();
  dc.resize(static_cast<size_t>(nDC));
  fr.resize(static_cast<size_t>(nFR));
  sl2gr.resize(static_cast<size_t>(nSL2GR));
  gr2sl.resize(static_cast<size_t>(nGR2SL));
  sl2theta.resize(static_cast<size_t>(nSL2THETA));
  sl2phi.resize(static_cast<size_t>(nSL2PHI));
  syncCounts();
  setAllocationFlag(true);
  return 0;
}

int polySAR::CreatePolys(int nDC, int nFR) { return CreatePolys(nDC, nFR, 0, 0, 0, 0); }

void polySAR::DestroyPolys() {
  dc.clear();
  fr.clear();
  sl2gr.clear();
  gr2sl.clear();
  sl2theta.clear();
  sl2phi.clear();
  syncCounts();
  setAllocationFlag(false);
}

int polySAR::EvaluateDC(double r, double a, double& out) const { return evaluate_selected(dc, "DC", r, a, out); }
int polySAR::EvaluateFR(double r, double a, double& out) const { return evaluate_selected(fr, "FR", r, a, out); }
int polySAR::EvaluateSL2GR(double r, double a, double& out) const {
  return evaluate_selected(sl2gr, "SL2GR", r, a, out);
}
int polySAR::EvaluateGR2SL(double r, double a, double& out) const {
  return evaluate_selected(gr2sl, "GR2SL", r, a, out);
}
int polySAR::EvaluateSL2THETA(double r, double a, double& out) const {
  return evaluate_selected(sl2theta, "SL2THETA", r, a, out);
}
int polySAR::EvaluateSL2PHI(double r, double a, double& out) const {
  return evaluate_selected(sl2phi, "SL2PHI", r, a, out);
}

int polySAR::getDCpoly(double a, std::array<double, kPolyCoefficients>& out) const {
  return interpolated_coefficients(dc, "DC", a, out);
}
int polySAR::getFRpoly(double a, std::array<double, kPolyCoefficients>& out) const {
  return interpolated_coefficients(fr, "FR", a, out);
}
int polySAR::getSL2GRpoly(double a, std::array<double, kPolyCoefficients>& out) const {
  return selected_coefficients(sl2gr, "SL2GR", a, out);
}
int polySAR::getGR2SLpoly(double a, std::array<double, kPolyCoefficients>& out) const {
  return selected_coefficients(gr2sl, "GR2SL", a, out);
}
int polySAR::getSL2THETApoly(double a, std::array<double, kPolyCoefficients>& out) const {
  return selected_coefficients(sl2theta, "SL2THETA", a, out);
}
int polySAR::getSL2PHIpoly(double a, std::array<double, kPolyCoefficients>& out) const {
  return selected_coefficients(sl2phi, "SL2PHI", a, out);
}

int polySAR::getDCnum(double a, int& index) const { return selected_number(dc, "DC", a, index); }
int polySAR::getFRnum(double a, int& index) const { return selected_number(fr, "FR", a, index); }
int polySAR::getSL2GRnum(double a, int& index) const { return selected_number(sl2gr, "SL2GR", a, index); }
int polySAR::getGR2SLnum(double a, int& index) const { return selected_number(gr2sl, "GR2SL", a, index); }
int polySAR::getSL2THETAnum(double a, int& index) const { return selected_number(sl2theta, "SL2THETA", a, index); }
int polySAR::getSL2PHInum(double a, int& index) const { return selected_number(sl2phi, "SL2PHI", a, index); }

namespace {
template <class P, class Get>
int interp_evaluate(const std::vector<P>& set, const char* name, double r, double a, double& out, Get get) {
  std::array<double, kPolyCoefficients> c{};
  if (int st = get(a, c)) {
    sar::base::report(sar::base::kReportErrorCallTree, "Called function returned ERROR");
    return st;
  }
  return evaluate_at_query(set, name, r, a, out, c);
}
}  // namespace

int polySAR::EvaluateDCinterp(double r, double a, double& out) const {
  return interp_evaluate(dc, "DC", r, a, out, [this](double t, auto& c) { return getDCpoly(t, c); });
}
int polySAR::EvaluateFRinterp(double r, double a, double& out) const {
  return interp_evaluate(fr, "FR", r, a, out, [this](double t, auto& c) { return getFRpoly(t, c); });
}
int polySAR::EvaluateSL2GRinterp(double r, double a, double& out) const {
  return interp_evaluate(sl2gr, "SL2GR", r, a, out, [this](double t, auto& c) { return getSL2GRpoly(t, c); });
}
int polySAR::EvaluateGR2SLinterp(double r, double a, double& out) const {
  return interp_evaluate(gr2sl, "GR2SL", r, a, out, [this](double t, auto& c) { return getGR2SLpoly(t, c); });
}
int polySAR::EvaluateSL2THETAinterp(double r, double a, double& out) const {
  return interp_evaluate(sl2theta, "SL2THETA", r, a, out, [this](double t, auto& c) { return getSL2THETApoly(t, c); });
}
int polySAR::EvaluateSL2PHIinterp(double r, double a, double& out) const {
  return interp_evaluate(sl2phi, "SL2PHI", r, a, out, [this](double t, auto& c) { return getSL2PHIpoly(t, c); });
}

int polySAR::writehdr(const std::string& path) {
  if (path.empty()) return 1;
  // The counts first: rewriting the "PolySAR" section also drops the members of an older set.
  if (writeSection(path, 1, kPolySarSection) != 0) return 1;
  if (write_set(dc, path) || write_set(fr, path) || write_set(sl2gr, path) || write_set(gr2sl, path) ||
      write_set(sl2theta, path) || write_set(sl2phi, path)) {
    return 1;
  }
  return 0;
}

int polySAR::readhdr(const std::string& path) {
  if (path.empty()) return 1;
  // Read into a scratch object: refreshParameters() would otherwise reset the counts to the
  // sizes of the sets held now.
  struct Counts : GeneralSAR_BaseXML {
    std::array<int32_t, 6> n{};
    int refreshParameters() override {
      static constexpr const char* kNames[6] = {"ndc", "nfr", "nsl2gr", "ngr2sl", "nsl2theta", "nsl2phi"};
      createElementsVector(6);
      int st = 0;
      for (size_t i = 0; i < n.size(); ++i) st |= addElementInt(kNames[i], &n[i], 1, 0.0, kMaxPolysInSet, true);
      return st;
    }
  } counts;
  if (counts.readSection(path, 1, kPolySarSection) != 0) return 1;
  const auto& n = counts.n;
  if (int st = CreatePolys(n[0], n[1], n[2], n[3], n[4], n[5])) return st;
  if (read_set(dc, path) || read_set(fr, path) || read_set(sl2gr, path) || read_set(gr2sl, path) ||
      read_set(sl2theta, path) || read_set(sl2phi, path)) {
    return 1;
  }
  return 0;
}

int polySAR::clone(const polySAR& other) {
  if (this == &other) return 0;
  dc = other.dc;
  fr = other.fr;
  sl2gr = other.sl2gr;
  gr2sl = other.gr2sl;
  sl2theta = other.sl2theta;
  sl2phi = other.sl2phi;
  syncCounts();
  setAllocationFlag(other.getAllocationFlag());
  return 0;
}

}  // namespace sar::metadata

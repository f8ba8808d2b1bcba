#include "doppler/dcestconf.hpp"

#include <algorithm>

#include "base/profile.hpp"

namespace sar::doppler {

const char* centroid_source_text(CentroidSource source) {
  switch (source) {
    case CentroidSource::Fit: return "fitted surface of the blocks";
    case CentroidSource::Constant: return "one constant from all signal blocks";
    case CentroidSource::Geometry: return "orbit geometry";
  }
  return "?";
}

void read_dcestconf(const std::string& f, dcestconf& dc) {
  using base::GetCheckMyProfileDouble;
  using base::GetCheckMyProfileInt;
  const char* s = "DCestConf";
  // Optional here: a job may take the memory allowed from a section of its own.
  int32_t memory = 0;
  if (base::GetMyProfileIntArray(s, "Memory", std::span<int32_t>(&memory, 1), f) == base::kProfileOk)
    dc.Memory = memory;
  dc.RgBand = GetCheckMyProfileDouble(s, "RgBand", f);
  dc.Blocks = GetCheckMyProfileInt(s, "Blocks", f);
  dc.Blockl = GetCheckMyProfileInt(s, "Blockl", f);
  dc.AnLen = GetCheckMyProfileDouble(s, "AnLen", f);
  dc.Kthr = GetCheckMyProfileDouble(s, "Kthr", f);
  dc.Lookbf = GetCheckMyProfileDouble(s, "Lookbf", f);
  dc.Lookbt = GetCheckMyProfileDouble(s, "Lookbt", f);
  dc.Lookrp = GetCheckMyProfileDouble(s, "Lookrp", f);
  dc.Lookrs = GetCheckMyProfileDouble(s, "Lookrs", f);
  dc.Decfac = GetCheckMyProfileInt(s, "Decfac", f);
  dc.Flength = GetCheckMyProfileInt(s, "Flength", f);
  dc.Dftstep = GetCheckMyProfileDouble(s, "Dftstep", f);
  dc.Fftrgprc = GetCheckMyProfileDouble(s, "Fftrgprc", f);
  dc.Fftazprc = GetCheckMyProfileDouble(s, "Fftazprc", f);
  dc.Peakwid = GetCheckMyProfileDouble(s, "Peakwid", f);
  dc.Minamb = GetCheckMyProfileDouble(s, "Minamb", f);
  dc.Maxamb = GetCheckMyProfileDouble(s, "Maxamb", f);
  dc.Sthr = GetCheckMyProfileDouble(s, "Sthr", f);
  dc.Nbestblocks = GetCheckMyProfileInt(s, "Nbestblocks", f);
  dc.Nummlbf = GetCheckMyProfileInt(s, "Nummlbf", f);
  dc.Nwdarblocks = GetCheckMyProfileInt(s, "Nwdarblocks", f);
  dc.Varthr = GetCheckMyProfileDouble(s, "Varthr", f);
  dc.Patchs = GetCheckMyProfileInt(s, "Patchs", f);
  dc.Patchl = GetCheckMyProfileInt(s, "Patchl", f);
  dc.Dswst = GetCheckMyProfileInt(s, "Dswst", f);
  dc.Amb_flag = GetCheckMyProfileInt(s, "Amb_flag", f);
  // Optional keys. Without weights every term of the surface is fitted (all zeros would fit
  // nothing).
  if (base::GetMyProfileIntArray(s, "Pol_Weights", dc.Pol_Weights, f) != base::kProfileOk) dc.Pol_Weights.fill(1);
  double bound = 0.0;
  if (base::GetProfileDoubleArray(s, "AttitudeErrorBound", std::span<double>(&bound, 1), f) == base::kProfileOk &&
      bound > 0.0)
    dc.AttitudeErrorBound = bound;
  if (base::GetProfileDoubleArray(s, "CentroidScatterBound", std::span<double>(&bound, 1), f) == base::kProfileOk &&
      bound > 0.0)
    dc.CentroidScatterBound = bound;
}

}  // namespace sar::doppler

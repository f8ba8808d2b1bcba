#include "stripmap/procparm.hpp"

#include "base/profile.hpp"

namespace sar::stripmap {

void read_azimuthconf(const std::string& f, azimuthconf& az) {
  using base::GetCheckMyProfileDouble;
  using base::GetCheckMyProfileInt;
  const char* s = "AzimuthConf";
  az.AntennaLength = GetCheckMyProfileDouble(s, "AntennaLength", f);
  az.WhiteningFlag = GetCheckMyProfileInt(s, "WhiteningFlag", f);
  az.RangeWindowHammingParameter = GetCheckMyProfileDouble(s, "RangeWindowHammingParameter", f);
  az.AzimuthWindowHammingParameter = GetCheckMyProfileDouble(s, "AzimuthWindowHammingParameter", f);
  az.RangeLookBandwidth = GetCheckMyProfileDouble(s, "RangeLookBandwidth", f);
  az.AzimuthLookBandwidth = GetCheckMyProfileDouble(s, "AzimuthLookBandwidth", f);
  az.RangeTransitionBandwidth = GetCheckMyProfileDouble(s, "RangeTransitionBandwidth", f);
  az.AzimuthTransitionBandwidth = GetCheckMyProfileDouble(s, "AzimuthTransitionBandwidth", f);
  az.LinesInBlock = GetCheckMyProfileInt(s, "LinesInBlock", f);
  az.SamplesInBlock = GetCheckMyProfileInt(s, "SamplesInBlock", f);
  az.RangeOverlap = GetCheckMyProfileInt(s, "RangeOverlap", f) / 2;
  az.AzimuthOverlap = GetCheckMyProfileInt(s, "AzimuthOverlap", f) / 2;
  az.PerformInterpolation = GetCheckMyProfileInt(s, "PerformInterpolation", f);
  az.StoltPadding = GetCheckMyProfileDouble(s, "StoltPadding", f);
}

}  // namespace sar::stripmap

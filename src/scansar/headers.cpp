// Header of a focused sub-swath: what the multilooker needs to join bursts and sub-swaths.
#include <cstdio>
#include <string>

#include "base/profile.hpp"
#include "scansar/wide_swath.hpp"

namespace sar::scansar {

int write_WShdr(const std::string& path, int s, const scansar& scan, const wsparm& par, const DopplerEstimate& est,
                const RangeFocused& focused, bool ascending) {
  using namespace base;
  const auto i = static_cast<std::size_t>(s);
  FreeProfile(path);
  std::remove(path.c_str());
  const char* g = "General";
  WriteMyProfileString(g, "Product", "WideSwath SINGLE SWATH COMPLEX", path);
  WriteMyProfileString(g, "Generator", "WSProcessor v1.1", path);
  WriteMyProfileString(g, "Centre", "OMBRIX - Tarvia", path);
  char name[16];
  std::snprintf(name, sizeof name, "SS%d", s + 1);
  WriteMyProfileString(g, "SubSwath", name, path);
  WriteMyProfileString(g, "Pass", ascending ? "ASCENDING" : "DESCENDING", path);
  WriteMyProfileString(g, "RangeWindow", "HAMMING", path);
  WriteMyProfileDouble(g, "RangeWindowCoefficient", par.rangeHamming, path);
  WriteMyProfileDouble(g, "AzimuthWindowCoefficient", par.azimuthHamming, path);
  const char* a = "Acquisition";
  WriteMyProfileDouble(a, "SamplingFrequency", scan.samplingRate, path);
  WriteMyProfileDouble(a, "CarrierFrequency", scan.carrierFrequency, path);
  WriteMyProfileDouble(a, "PRF", scan.prf[i], path);
  WriteMyProfileInt(a, "Bursts", scan.bursts, path);
  WriteMyProfileInt(a, "EchoesPerBurst", scan.echoes[i], path);
  WriteMyProfileIntArray(a, "FiringOrder", scan.order, path);
  WriteProfileDoubleArray(a, "BurstOffsets", scan.burstOffset, path);
  WriteMyProfileDouble(a, "CycleTime", scan.cycleTime, path);
  WriteMyProfileDouble(a, "FirstLineTime", scan.firstLineTime, path);
  const char* o = "Image";
  const int32_t ov = par.rangeOverlap;
  WriteMyProfileInt(o, "Samples", focused.validColumns - ov, path);
  WriteMyProfileInt(o, "LinesPerBurst", par.linesPerBurst[i], path);
  WriteMyProfileInt(o, "LinePrefixBytes", 17, path);
  WriteMyProfileDouble(o, "NearRangeTime", focused.nearTime + (focused.firstValid + ov / 2) / scan.samplingRate, path);
  // Columns left out of the image: the alignment's zeros, the chirp's tail, the range
  // sub-blocks' margins.
  WriteMyProfileInt(o, "TrimmedNearColumns", focused.firstValid + ov / 2, path);
  WriteMyProfileInt(o, "TrimmedFarColumns", focused.width - focused.firstValid - focused.validColumns + ov / 2, path);
  WriteMyProfileDouble(o, "AzimuthStep", par.azimuthStep, path);
  WriteMyProfileDouble(o, "HalfWindow", half_window(scan, par), path);
  WriteMyProfileInt(o, "FirstLine", par.firstLine[i], path);
  WriteMyProfileInt(o, "LastLine", par.lastLine[i], path);
  WriteMyProfileDouble(o, "EarliestTime", par.earliestTime[i], path);
  WriteMyProfileDouble(o, "LatestTime", par.latestTime[i], path);
  WriteMyProfileInt(o, "Descalloped", par.compensateAntenna, path);
  const char* d = "Doppler";
  WriteMyProfileDouble(d, "ReferenceRangeTime", est.refTime, path);
  WriteProfileDoubleArray(d, "Centroid", est.centroid[i], path);
  WriteProfileDoubleArray(d, "Rate", est.rate[i], path);
  WriteMyProfileDouble(d, "Incidence", est.incidence[i], path);
  WriteProfileDoubleArray(d, "SlantToGround", est.slantToGround[i], path);
  return SyncProfile(path);
}

}  // namespace sar::scansar

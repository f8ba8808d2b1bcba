// Header of a focused sub-swath: what the multilooker needs to join bursts and sub-swaths.
#include <algorithm>
#include <cmath>
#include <cstdio>
#include <string>

#include "base/profile.hpp"
#include "scansar/wide_swath.hpp"

namespace sar::scansar {

void ImageStatistics::add(std::span<const std::complex<float>> samples) {
  for (const auto& z : samples) {
    const double re = z.real(), im = z.imag();
    if (re == 0.0 && im == 0.0) continue;
    const double p = re * re + im * im;
    sumRe += re;
    sumIm += im;
    sumRe2 += re * re;
    sumIm2 += im * im;
    sumAmplitude += std::sqrt(p);
    sumPower += p;
    peakRe = std::max(peakRe, std::abs(re));
    peakIm = std::max(peakIm, std::abs(im));
    ++count;
  }
}

void ImageStatistics::merge(const ImageStatistics& o) {
  sumRe += o.sumRe;
  sumIm += o.sumIm;
  sumRe2 += o.sumRe2;
  sumIm2 += o.sumIm2;
  sumAmplitude += o.sumAmplitude;
  sumPower += o.sumPower;
  peakRe = std::max(peakRe, o.peakRe);
  peakIm = std::max(peakIm, o.peakIm);
  count += o.count;
}

double ImageStatistics::std_re() const {
  return count ? std::sqrt(std::max(0.0, sumRe2 / count - mean_re() * mean_re())) : 0.0;
}
double ImageStatistics::std_im() const {
  return count ? std::sqrt(std::max(0.0, sumIm2 / count - mean_im() * mean_im())) : 0.0;
}

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
  WriteProfileDoubleArray(o, "SlantToElevation", est.slantToElevation[i], path);
  WriteMyProfileInt(o, "ElevationCorrected", par.elevation[i].amplitude.empty() ? 0 : 1, path);
  const char* st = "Statistics";
  const ImageStatistics& m = par.statistics[i];
  WriteMyProfileDouble(st, "MeanReal", m.mean_re(), path);
  WriteMyProfileDouble(st, "MeanImaginary", m.mean_im(), path);
  WriteMyProfileDouble(st, "StdReal", m.std_re(), path);
  WriteMyProfileDouble(st, "StdImaginary", m.std_im(), path);
  WriteMyProfileDouble(st, "MeanAmplitude", m.mean_amplitude(), path);
  WriteMyProfileDouble(st, "MeanPower", m.mean_power(), path);
  WriteMyProfileDouble(st, "PeakReal", m.peakRe, path);
  WriteMyProfileDouble(st, "PeakImaginary", m.peakIm, path);
  WriteMyProfileDouble(st, "Samples", static_cast<double>(m.count), path);
  const SceneCorners& k = par.corners[i];
  if (k.valid) {
    const char* c = "Corners";  // latitude, longitude (degrees)
    WriteProfileDoubleArray(c, "FirstNear", k.firstNear, path);
    WriteProfileDoubleArray(c, "FirstFar", k.firstFar, path);
    WriteProfileDoubleArray(c, "LastNear", k.lastNear, path);
    WriteProfileDoubleArray(c, "LastFar", k.lastFar, path);
    WriteProfileDoubleArray(c, "Centre", k.centre, path);
  }
  const char* d = "Doppler";
  WriteMyProfileDouble(d, "ReferenceRangeTime", est.refTime, path);
  WriteProfileDoubleArray(d, "Centroid", est.centroid[i], path);
  WriteProfileDoubleArray(d, "Rate", est.rate[i], path);
  WriteMyProfileDouble(d, "Incidence", est.incidence[i], path);
  WriteProfileDoubleArray(d, "SlantToGround", est.slantToGround[i], path);
  // Granule g of the scene: polynomials centred GranuleReference + g GranuleStep seconds after
  // the first line (granule 0, the whole scene, as Centroid and Rate).
  const std::size_t granules = std::min(est.granuleCentroid.size(), est.granuleRate.size());
  WriteMyProfileInt(d, "Granules", static_cast<int32_t>(std::max<std::size_t>(1, granules)), path);
  WriteMyProfileDouble(d, "GranuleReference", est.granuleReference, path);
  WriteMyProfileDouble(d, "GranuleStep", est.granuleStep, path);
  for (std::size_t g = 0; g < granules; ++g) {
    WriteProfileDoubleArray(d, "Centroid_" + std::to_string(g), est.granuleCentroid[g][i], path);
    WriteProfileDoubleArray(d, "Rate_" + std::to_string(g), est.granuleRate[g][i], path);
  }
  return SyncProfile(path);
}

}  // namespace sar::scansar

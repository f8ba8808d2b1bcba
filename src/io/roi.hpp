#pragma once
// Regions of interest: where a data set lies on its two time axes, slow (azimuth time) and fast
// (range time), and the arithmetic that turns times into line and sample indices.
//
// A region holds, per axis, a start time, a step (delta), a count and the length count x delta;
// SetFastAxe / SetSlowAxe keep that relation. Indices round half away from zero. Regions are
// read from and written to a header section (SlowStartTime, SlowTimeLength, SlowTimeDelta,
// FastStartTime, FastTimeLength, FastTimeDelta, Lines, Samples), XML first, else profile text.
#include <cstdint>
#include <string>
#include <string_view>
#include <utility>

#include "metadata/base_xml.hpp"

namespace sar::io {

class ROI_Obj : public metadata::GeneralSAR_BaseXML {
 public:
  double fastStart = 0.0;
  double slowStart = 0.0;
  double fastLength = 0.0;
  double slowLength = 0.0;
  double fastDelta = 0.0;
  double slowDelta = 0.0;
  int32_t samples = 0;
  int32_t lines = 0;

  int refreshParameters() override;

  void SetFastAxe(double start, double delta, int count);
  void SetSlowAxe(double start, double delta, int count);
  void ResetROI();
  /// True when the region holds no sample or no line.
  bool isNULL() const { return samples <= 0 || lines <= 0; }

  /// Nearest index of a time; the count of a length.
  int GetFastIndex(double time) const;
  int GetSlowIndex(double time) const;
  int GetFastRange(double length) const;
  int GetSlowRange(double length) const;

  /// Corners and centre as (fast, slow) time pairs: up is the first line, left the first sample.
  std::pair<double, double> GetUpLeft() const { return {fastStart, slowStart}; }
  std::pair<double, double> GetUpRight() const { return {fastStart + fastLength, slowStart}; }
  std::pair<double, double> GetDownLeft() const { return {fastStart, slowStart + slowLength}; }
  std::pair<double, double> GetDownRight() const { return {fastStart + fastLength, slowStart + slowLength}; }
  std::pair<double, double> GetCenter() const { return {fastStart + 0.5 * fastLength, slowStart + 0.5 * slowLength}; }

  /// Reads the section of `file`: the XML header first, else the profile keys one by one. True
  /// when Samples could be read.
  bool read_roi(const std::string& file, std::string_view section);
  /// Writes the section in the dialect of the file already there (profile text for a new one).
  /// 0 or 1.
  int write_roi(const std::string& file, std::string_view section);
};

/// The overlap of two regions, with a's steps; an empty overlap is the zero region. 0.
int IntersectROI(const ROI_Obj& a, const ROI_Obj& b, ROI_Obj& result);

}  // namespace sar::io

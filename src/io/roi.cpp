#include "io/roi.hpp"

#include <algorithm>
#include <cmath>

#include "base/profile.hpp"

namespace sar::io {

namespace {

int round_half_away(double x) { return static_cast<int>(x >= 0.0 ? std::floor(x + 0.5) : std::ceil(x - 0.5)); }

int count_of(double length, double delta) { return delta != 0.0 ? round_half_away(length / delta) : 0; }

}  // namespace

int ROI_Obj::refreshParameters() {
  createElementsVector(8);
  addElementDouble("SlowStartTime", &slowStart, 1, 0.0, 0.0, false);
  addElementDouble("SlowTimeLength", &slowLength, 1, 0.0, 0.0, false);
  addElementDouble("SlowTimeDelta", &slowDelta, 1, 0.0, 0.0, false);
  addElementDouble("FastStartTime", &fastStart, 1, 0.0, 0.0, false);
  addElementDouble("FastTimeLength", &fastLength, 1, 0.0, 0.0, false);
  addElementDouble("FastTimeDelta", &fastDelta, 1, 0.0, 0.0, false);
  addElementInt("Lines", &lines, 1, 0.0, 0.0, false);
  addElementInt("Samples", &samples, 1, 0.0, 0.0, true);
  return 0;
}

void ROI_Obj::SetFastAxe(double start, double delta, int count) {
  fastStart = start;
  fastDelta = delta;
  samples = count;
  fastLength = count * delta;
}

void ROI_Obj::SetSlowAxe(double start, double delta, int count) {
  slowStart = start;
  slowDelta = delta;
  lines = count;
  slowLength = count * delta;
}

void ROI_Obj::ResetROI() {
  fastStart = slowStart = fastLength = slowLength = fastDelta = slowDelta = 0.0;
  samples = lines = 0;
}

int ROI_Obj::GetFastIndex(double time) const { return count_of(time - fastStart, fastDelta); }
int ROI_Obj::GetSlowIndex(double time) const { return count_of(time - slowStart, slowDelta); }
int ROI_Obj::GetFastRange(double length) const { return count_of(length, fastDelta); }
int ROI_Obj::GetSlowRange(double length) const { return count_of(length, slowDelta); }

bool ROI_Obj::read_roi(const std::string& file, std::string_view section) {
  if (metadata::header_dialect(file) == metadata::HeaderDialect::kXml)
    return readAuxiliaryFile(file, 1, section) == 0;
  double v[1];
  auto get = [&](std::string_view key, double& field) {
    if (base::GetParDouble(file, key, v, section) == base::kProfileOk) field = v[0];
  };
  get("SlowStartTime", slowStart);
  get("SlowTimeLength", slowLength);
  get("SlowTimeDelta", slowDelta);
  get("FastStartTime", fastStart);
  get("FastTimeLength", fastLength);
  get("FastTimeDelta", fastDelta);
  int32_t n[1];
  if (base::GetParInt(file, "Lines", n, section) == base::kProfileOk) lines = n[0];
  if (base::GetParInt(file, "Samples", n, section) != base::kProfileOk) return false;
  samples = n[0];
  return true;
}

int ROI_Obj::write_roi(const std::string& file, std::string_view section) {
  if (metadata::header_dialect(file) == metadata::HeaderDialect::kXml) return writeAuxiliaryFile(file, 1, section);
  using base::WriteMyProfileDouble;
  WriteMyProfileDouble(section, "SlowStartTime", slowStart, file);
  WriteMyProfileDouble(section, "SlowTimeLength", slowLength, file);
  WriteMyProfileDouble(section, "SlowTimeDelta", slowDelta, file);
  WriteMyProfileDouble(section, "FastStartTime", fastStart, file);
  WriteMyProfileDouble(section, "FastTimeLength", fastLength, file);
  WriteMyProfileDouble(section, "FastTimeDelta", fastDelta, file);
  base::WriteMyProfileInt(section, "Lines", lines, file);
  base::WriteMyProfileInt(section, "Samples", samples, file);
  return base::SyncProfile(file) == 0 ? 0 : 1;
}

int IntersectROI(const ROI_Obj& a, const ROI_Obj& b, ROI_Obj& result) {
  const double fastStart = std::max(a.fastStart, b.fastStart);
  const double slowStart = std::max(a.slowStart, b.slowStart);
  const double fastEnd = std::min(a.fastStart + a.fastLength, b.fastStart + b.fastLength);
  const double slowEnd = std::min(a.slowStart + a.slowLength, b.slowStart + b.slowLength);
  const int samples = a.fastDelta != 0.0 ? static_cast<int>((fastEnd - fastStart) / a.fastDelta) : 0;
  const int lines = a.slowDelta != 0.0 ? static_cast<int>((slowEnd - slowStart) / a.slowDelta) : 0;
  result.SetFastAxe(fastStart, a.fastDelta, samples);
  result.SetSlowAxe(slowStart, a.slowDelta, lines);
  if (result.isNULL()) result.ResetROI();
  return 0;
}

}  // namespace sar::io

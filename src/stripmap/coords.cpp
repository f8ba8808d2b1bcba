#include "stripmap/coords.hpp"

#include <string>

#include "base/diagnostics.hpp"
#include "geometry/geolocation.hpp"
#include "base/constants.hpp"

namespace sar::stripmap {

int get_coords(procparm& proc, const metadata::sarpar& par) {
  base::Frame frame("get_coords");
  geometry::grpt_rec rec = geometry::zero_doppler_record(proc.orbitPositions, proc.orbitStartTime, proc.orbitSpacing,
                                                         base::kSpeedOfLight / par.carrierFrequency);
  // The focused grid, not the raw extent: the block overlaps are gone from the SLC.
  const double t0 = proc.firstLineTime, r0 = proc.firstSampleTime;
  const double T = proc.focusedLines / par.prf, R = proc.focusedSamples / par.samplingRate;
  const double at[5][2] = {{t0, r0}, {t0, r0 + R}, {t0 + T, r0}, {t0 + T, r0 + R}, {t0 + 0.5 * T, r0 + 0.5 * R}};
  for (int i = 0; i < 5; ++i) {
    rec.azimuth_time = at[i][0];
    rec.tau = at[i][1];
    if (int st = geometry::gr_pt_lat_lon(rec, 6378137.0, 6356752.314245)) {
      base::report(base::kReportError, "Corner " + std::to_string(i + 1) + " of the image cannot be geolocated");
      return frame.check(st);
    }
    auto& c = proc.corners[static_cast<std::size_t>(i)];
    c.rangeTime = rec.tau;
    c.azimuthTime = rec.azimuth_time;
    c.latitude = rec.latitude;
    c.longitude = rec.longitude;
  }
  proc.centreIncidence = rec.incidence;
  proc.centreLook = rec.look;
  return 0;
}

}  // namespace sar::stripmap

#pragma once
// Corner and centre coordinates of a focused stripmap image.
#include "metadata/acquisition.hpp"
#include "stripmap/procparm.hpp"

namespace sar::stripmap {

/// Geolocates the four corners and the centre of the focused grid (first line and sample of
/// the SLC, focused sizes) at zero Doppler on the WGS84 ellipsoid from the orbit block of
/// `proc`, and stores range time, azimuth time, latitude and longitude of each in
/// proc.corners (near-early, far-early, near-late, far-late, centre), with the incidence and
/// look angles of the centre. Returns 0, or the failing geolocation's status.
int get_coords(procparm& proc, const metadata::sarpar& par);

}  // namespace sar::stripmap

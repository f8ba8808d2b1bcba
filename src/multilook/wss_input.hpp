#pragma once
// The wide swath multilook's inputs from a level 1 WSS product and an orbit product.
#include <array>
#include <string>

#include "envisat/level1.hpp"
#include "multilook/strip_multilook.hpp"
#include "multilook/ws_multilook.hpp"

namespace sar::multilook {

/// The five sub-swaths of a read and checked WSS product: MDS d with the geolocation record of
/// SSd (its near slant time and incidence) and the DCC record of the same rank. 0, or 10 with
/// `error`.
int wss_sub_swaths(const envisat::Level1Product& product, std::array<WsSubSwath, 5>& swaths, std::string& error);

/// Five state vectors of an orbit product around `time` (sec85), for geolocation. 0, or 10 with
/// `error` (unreadable orbit, time outside it).
int orbit_geometry(const std::string& orbitPath, double time, double carrierFrequency, SlcGrid& grid,
                   std::string& error);

}  // namespace sar::multilook

#pragma once
// DORIS precise orbit product (DOR_VOR_AX) written from the orbit model: MPH, a 378-byte SPH
// with one DSD, and one 129-byte ASCII record per state vector.
#include <string>

#include "simulator/orbit_model.hpp"

namespace sar::simulator {

inline constexpr std::size_t kOrbitSphBytes = 378;
inline constexpr std::size_t kOrbitRecordBytes = 129;

struct OrbitFileRequest {
  double start = 0.0;     // sec85 of the first record
  double stop = 0.0;      // no record after this time
  double step = 60.0;     // s between records
  double proc_time = 0.0; // sec85 written as PROC_TIME and in the name; 0: 29 days after the stop
};

/// Name of the product, e.g. "DOR_VOR_AXVF-P20080331_075200_20080301_215527_20080303_002327".
std::string orbit_product_name(const OrbitFileRequest& request);

/// One 129-byte record: "dd-MMM-yyyy hh:mm:ss.uuuuuu dUT1 orbit X Y Z VX VY VZ quality\n".
std::string orbit_record(const StateVector& state, int absolute_orbit);

/// Writes the product into `folder` under its product name and returns the full path.
/// Throws std::runtime_error when the file cannot be written.
std::string write_orbit_file(const OrbitModel& orbit, const OrbitFileRequest& request, const std::string& folder);

}  // namespace sar::simulator

#pragma once
// A simulated ENVISAT ASAR level 1 wide swath single-look product (ASA_WSS_1P): five
// sub-swaths of focused bursts, in zero-Doppler geometry, as a burst focuser leaves them.
//
// Layout: MPH, SPH (the level 1 field positions, then the DSDs), one main processing
// parameters record of 2009 bytes, one Doppler centroid record and one geolocation grid record
// (swath name "SSd" at byte 499) for each sub-swath, then the measurement data sets "MDS1" ..
// "MDS5": records of a 17-byte prefix (zero-Doppler time MJD2000, a quality byte, the line
// number) and big-endian int16 I/Q samples. Each MDS holds its bursts one after the other, every
// burst `burst_lines` lines long on the common line grid and centred on its acquisition time, so
// that the lines of successive bursts overlap in time.
//
// The scene: independent uniform clutter in every burst, of the range band `range_band` and of
// power falling as (R0 / R)^3 with slant range R (so a multilook that removes the range spreading
// finds it flat), plus point targets that every burst covering them shows, of the burst's
// azimuth resolution. The geometry follows an orbit product given by the caller (the real
// DOR_VOR of the sample archive serves), with the look to the right.
#include <array>
#include <string>
#include <vector>

namespace sar::simulator {

struct WssTarget {
  int swath = 1;             // 1..5
  double line = 0.0;         // line of the output grid (from the product's first line time)
  double sample = 0.0;       // sample of the sub-swath
  double amplitude = 1000.0; // counts
};

struct WssConfig {
  std::string out_dir = ".";
  std::string orbit_path;                          // ENVISAT orbit product (required)
  std::string start_time = "02-MAR-2008 10:00:00.000000";  // first line
  double line_time_interval = 1.0 / 1652.4;       // s, common to all sub-swaths
  double sampling_rate = 19.20768e6;              // Hz
  double range_band = 16.0e6;                     // Hz of clutter and target spectra
  double azimuth_band = 200.0;                    // Hz: a burst's azimuth resolution
  int samples = 320;                              // per sub-swath
  int overlap = 40;                               // samples shared by neighbouring sub-swaths
  double near_range = 850.0e3;                    // m, slant range of SS1's first sample
  int bursts = 6;
  int burst_lines = 320;                          // focused lines of a burst
  int cycle_lines = 200;                          // lines from one burst of a sub-swath to the next
  std::array<int, 5> swath_offset_lines = {0, 40, 80, 120, 160};  // acquisition time in the cycle
  double clutter_std = 300.0;                     // counts at the reference range
  double range_window = 1.0;                      // Hamming coefficient over the clutter's band (1: white)
  std::vector<WssTarget> targets;
  unsigned seed = 7;
  bool truncate_mds = false;                      // cut the last MDS short (a fault)
  int drop_swath = 0;                             // 1..5: leave that sub-swath's MDS out (a fault)
};

struct WssProduct {
  std::string path;
  std::string name;
  double first_line_time = 0.0;  // sec85
  std::array<double, 5> near_time{};  // two-way s
  double reference_range = 0.0;  // m, R0 of the clutter power law
  int lines = 0;                 // of the common grid the bursts span
};

/// Writes the product into config.out_dir and returns where and what. Throws std::runtime_error
/// for an unreadable orbit or an unwritable folder.
WssProduct write_wss_product(const WssConfig& config);

}  // namespace sar::simulator

#pragma once
// Extraction of a RADARSAT-1 CEOS raw data set: the data file's signal records to a raw raster
// of complex float lines, each behind a float near range time (the layout of the ENVISAT line
// files, so the stripmap stages read both), the averaged chirp replica, and the acquisition.
//
// Line bookkeeping: the data file's own line index orders the records. A gap in the index is
// filled with zero lines (each carrying the last written line's range time); a repeated or
// backward index drops that record with a report; a gap of more than 1000 lines ends the
// extraction. Every record present is read: the descriptor's count counts records, not lines.
#include <cstdint>
#include <functional>
#include <string>
#include <vector>

#include "geometry/orbit_file.hpp"
#include "radarsat/ceos_leader.hpp"
#include "radarsat/signal_data.hpp"

namespace sar::radarsat {

/// Largest gap in the line index that is filled; a wider one ends the extraction.
inline constexpr int64_t kMaxLineGap = 1000;

struct ExtractRequest {
  std::string data_file;
  std::string leader_file;
  std::string orbit_file;  ///< text orbit; empty: the leader's vectors
  std::string raw_path;    ///< raw raster to write
  std::string chirp_path;  ///< replica raster to write (complex floats, one line)
  int64_t lines_to_skip = 0;
  int64_t lines_to_extract = 0;  ///< 0: all that follow the skipped ones
  std::function<void(int)> progress;  ///< percent, called when it grows
};

/// What the extraction found: the acquisition in the terms the focuser needs.
struct Acquisition {
  std::string beam;
  int beam_code = 0;
  int pulses_in_flight = 0;
  int adc_code = 0;
  double sampling_rate = 0.0;     ///< Hz
  double sampling_period = 0.0;   ///< s
  double pulse_bandwidth = 0.0;   ///< Hz
  double pulse_length = kPulseLength;
  double carrier_frequency = kCarrierFrequency;
  double wavelength = kWavelength;
  double prf = 0.0;               ///< Hz
  double near_range_time = 0.0;   ///< s, smallest line time met
  double far_range_time = 0.0;    ///< s, largest line time met
  double first_line_time = 0.0;   ///< sec85 of the first written line
  int64_t lines = 0;              ///< written, zero lines included
  int samples = 0;                ///< complex samples a line
  int replica_samples = 0;
  int replicas = 0;               ///< replicas averaged into the chirp
  int reference_attenuation = 0;  ///< dB, of the first written line
  int64_t missing_lines = 0;      ///< zero lines written for gaps
  int64_t dropped_records = 0;    ///< repeated or backward indices
  std::vector<int32_t> swst;      ///< W of each written line
  std::vector<int32_t> sequence;  ///< line index of each written line (0 for a zero line)
  std::vector<int32_t> missing;   ///< 1 for a zero line
  Leader leader;
  geometry::OrbitData orbit;      ///< Earth-fixed, from the leader or the text orbit
};

/// Read the data file descriptor: its length, the record count and the longest record length.
DataFileDescriptor read_data_descriptor(const std::string& dataFile);

/// Extract the data set. Throws CeosError (the file named, with what is wrong) for a missing or
/// truncated file, a leader of another satellite, too few state vectors, record lengths that
/// disagree with the descriptor, a change of receive duration or ADC rate, an unknown beam,
/// a gap beyond kMaxLineGap, no replica in the extracted lines. The raster and chirp are
/// written under temporary names and appear only when the extraction succeeds.
Acquisition radar_extract(const ExtractRequest& request);

/// The description of the extracted data set beside its rasters: "<raw>.hdr" holds the raw set
/// (raster, region, sampling constants, state vectors, pulse, data set info, sensor attitude,
/// swath info) and "<chirp>.hdr" the replica's raster header. Throws CeosError naming the
/// header when they cannot be written (and leaves neither behind).
void write_raw_description(const Acquisition& acquisition, const ExtractRequest& request);

}  // namespace sar::radarsat

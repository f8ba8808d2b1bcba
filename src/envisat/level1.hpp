#pragma once
// The headers and annotation data sets of an ENVISAT ASAR level 1 product (IMS, APS, WSS, ...).
//
// Layout: the 1247-byte MPH, then the SPH (its size in the MPH; 6099 bytes for IMS), whose last
// NUM_DSD x DSD_SIZE bytes are the data set descriptors. Every data set is found by its DSD's
// name and read by its own offset, record count and record size: the main processing
// parameters records are 2009 or 10069 bytes depending on the processor version, and the
// order of the annotation DSDs differs between products.
//
// Records parsed (big-endian, MJD2000 times):
//   MAIN PROCESSING PARAMS ADS: first and last zero-Doppler times (0, 13), swath name (41),
//     range and azimuth spacing (44, 48), line time interval (52), output lines and samples
//     (56, 60), data type (64).
//   DOP CENTROID COEFFS ADS (55 bytes): zero-Doppler time (0), slant time of the polynomial's
//     origin in ns (13), five coefficients (17), confidence (37), below-threshold flag (41).
//   GEOLOCATION GRID ADS (521 bytes): first zero-Doppler time (0), line number and lines of the
//     granule (13, 17), first tie point's sample number (25), slant time in ns (69), incidence
//     (113, deg), latitude and longitude (157, 201, millionths of a degree), swath
//     name (499..501; its last character is the sub-swath digit of a WSS product).
// The ANT and chirp data sets are located but not parsed.
#include <array>
#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

namespace sar::envisat {

inline constexpr int64_t kLevel1SphSize = 6099;
inline constexpr int64_t kDsdSize = 280;

/// Names of the data sets the reader uses.
inline constexpr std::string_view kMppName = "MAIN PROCESSING PARAMS ADS";
inline constexpr std::string_view kDccName = "DOP CENTROID COEFFS ADS";
inline constexpr std::string_view kSrGrName = "SR GR ADS";
inline constexpr std::string_view kChirpName = "CHIRP PARAMS ADS";
inline constexpr std::string_view kAntennaName = "MDS1 ANTENNA ELEV PATT ADS";
inline constexpr std::string_view kGeolocationName = "GEOLOCATION GRID ADS";

inline constexpr int64_t kDccRecordSize = 55;
inline constexpr int64_t kGeolocationRecordSize = 521;
inline constexpr int64_t kMdsRowPrefix = 17;

struct Dsd {
  std::string name;  // trailing blanks removed
  char type = ' ';   // 'M' measurement, 'A' annotation, 'G' global annotation, 'R' reference
  std::string filename;
  int64_t offset = 0;
  int64_t size = 0;
  int64_t count = 0;
  int64_t recordSize = 0;
  bool present() const { return size > 0 && count > 0; }
};

struct MppRecord {
  double firstTime = 0.0;  // sec85
  double lastTime = 0.0;
  std::string swath;       // "IS2", "SS1", ...
  float rangeSpacing = 0.0f;
  float azimuthSpacing = 0.0f;
  float lineTimeInterval = 0.0f;
  uint32_t lines = 0;
  uint32_t samples = 0;
  std::string dataType;    // "SWORD", ...
};

struct DccRecord {
  double time = 0.0;            // sec85
  double slantRangeTime = 0.0;  // s
  std::array<float, 5> coefficients{};
  float confidence = 0.0f;
  int belowThreshold = 0;
};

struct GeolocationRecord {
  double firstTime = 0.0;  // sec85
  uint32_t lineNumber = 0;
  uint32_t lines = 0;
  uint32_t firstSample = 0;
  double firstSlantTime = 0.0;  // s
  double firstIncidence = 0.0;  // deg
  double firstLatitude = 0.0;   // deg
  double firstLongitude = 0.0;  // deg
  std::string swath;            // "IS2", "SS3", ...
  int subSwath() const;         // 1..5 for "SSd", 0 otherwise
};

struct Level1Product {
  std::string path;
  std::string product;  // MPH product name
  std::string kind;     // the product's type letters: "IMS", "APS", "APP", "APM", "WSS", "WSM", "GM1", ...
  double sensingStart = 0.0;
  double sensingStop = 0.0;
  int64_t totalSize = 0;
  int64_t fileSize = 0;
  int64_t sphSize = 0;
  // SPH
  std::string descriptor;
  double firstLineTime = 0.0;
  double lastLineTime = 0.0;
  std::string swath, pass, sampleType, polarisation1, polarisation2, dataType;
  double rangeSpacing = 0.0, azimuthSpacing = 0.0, lineTimeInterval = 0.0;
  int lineLength = 0;
  std::string cellType;  // "SHORT" (SWORD, UWORD) or "BYTE"
  int channels = 0;
  std::vector<Dsd> dsds;
  std::vector<MppRecord> mpp;
  std::vector<DccRecord> dcc;
  std::vector<GeolocationRecord> geolocation;

  /// The DSD of that name (trailing blanks of either side ignored), or null.
  const Dsd* find(std::string_view name) const;
  /// The measurement data sets that hold records, in DSD order.
  std::vector<const Dsd*> measurements() const;
  /// The geolocation record of sub-swath d (1..5) of a WSS product, or null.
  const GeolocationRecord* geolocation_of(int subSwath) const;
};

/// Reads MPH, SPH, DSDs and the MPP, DCC and geolocation data sets. 0; 10 with `error` for a
/// product that is not level 1 ASAR, truncated headers or annotation, a data set record count
/// of 0 where one is required, an unknown data type; 1 for an unreadable file.
int read_level1(const std::string& path, Level1Product& product, std::string& error);

/// Checks that every measurement data set the DSDs announce is in the file whole. 0, or 10 with
/// `error` naming the first one that is missing or shorter than its DSD says.
int check_measurements(const Level1Product& product, std::string& error);

/// A WSS product holds five sub-swath MDSs "MDS1" .. "MDS5", each with one MPP record; 0, or 10
/// with `error` naming what is missing.
int check_wss_layout(const Level1Product& product, std::string& error);

}  // namespace sar::envisat

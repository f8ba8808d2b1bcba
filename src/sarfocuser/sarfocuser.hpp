#pragma once
// The raw-data focuser: a stripmap pipeline for raw rasters that come with their acquisition
// (RADARSAT-1 CEOS data sets), built from the stripmap stages: range compression into the
// work file "<output>.rgfoc", Doppler centroid estimation from the data (RADARSAT-1 is not yaw
// steered, so the centroid is searched over several PRFs on either side), the geometry
// polynomials, omega-K azimuth focusing and the corner coordinates.
//
// The raw data set comes described by its header "<raw>.hdr" (a raw set: raster, region,
// sampling constants, state vectors, pulse, data set info, attitude, swath). The stripmap stages
// take the acquisition as an ENVISAT `sarpar`; the focuser fills one from that description (the
// fields the stages read: rates, times, sizes, pulse) and the scene's orbit block from its state
// vectors. The focused image gets its own header "<output>.hdr", a focused set.
#include <string>

#include "doppler/dcestconf.hpp"
#include "geometry/orbit_file.hpp"
#include "io/general_sar.hpp"
#include "metadata/acquisition.hpp"
#include "stripmap/procparm.hpp"

namespace sar::sarfocuser {

/// Centroid search span of the data estimate, in PRFs on either side of zero.
inline constexpr double kAmbiguitySpan = 8.0;

/// Section "sarfocuserConfiguration" and the processing profile it names (this system keeps
/// both in one parameter file).
struct SARFocuser_conf {
  int Incore = 0;
  int Memory = 0;
  int Verbose = 0;
  int ReportLevel = 0;
  int DeleteTempFiles = 1;
  double DCref = 0.0;  ///< Hz; non-zero overrides the estimate
  std::string ReportFilename;
  std::string ProcessingConfFile;
  doppler::dcestconf dc;
  stripmap::azimuthconf az;
  int ApplyAzShift = 1;
  int ApplyRgShift = 1;
  int Flag_rangefoc = 1, Flag_rgpatt = 0, Flag_azimuthfoc = 1, Flag_dcest = 1;
  int Flag_ortog = 0, Flag_swstal = 1, Azblk = 2048, Multilook = 0;

  /// Reads every section from `parameterFile`; a missing mandatory key ends the run as every
  /// profile read does. Returns 0.
  int readconf(const std::string& parameterFile);
};

struct SARFocuser_input {
  std::string RawDataFile;
  std::string ChirpFile;
  std::string AntennaFile;
};

struct SARFocuser_output {
  std::string OutputFilename;  ///< the SLC; "<name>.rgfoc" is the range-compressed work file
};

class SARFocuser {
 public:
  SARFocuser(SARFocuser_conf conf, SARFocuser_input input, SARFocuser_output output);

  /// The whole pipeline. 0, 10 for a missing raw or chirp file or a raw description that lacks
  /// a record, or the failing stage's status (its name in failed_stage()).
  int run();

  /// The raw data set as its header describes it (after run()).
  const io::GeneralRAWData& raw() const { return raw_; }

  const metadata::sarpar& par() const { return par_; }
  const stripmap::procparm& proc() const { return proc_; }
  const stripmap::azimuthconf& az() const { return conf_.az; }
  const SARFocuser_conf& conf() const { return conf_; }
  /// Centroid used at the scene centre, Hz, and where it came from.
  double centroid() const { return centroid_; }
  bool centroid_from_data() const { return centroidFromData_; }
  const std::string& failed_stage() const { return failedStage_; }

 private:
  int process();
  int writeheaders();
  int fail(const char* stage, int status);

  SARFocuser_conf conf_;
  SARFocuser_input input_;
  SARFocuser_output output_;
  io::GeneralRAWData raw_;
  geometry::OrbitData orbit_;
  metadata::sarpar par_;
  stripmap::procparm proc_;
  double centroid_ = 0.0;
  bool centroidFromData_ = false;
  std::string failedStage_;
};

/// Beam-centre Doppler centroid of a right-looking antenna steered perpendicular to the
/// inertial velocity (no yaw steering), at azimuth time t (sec85) and two-way time tau. Hz.
double unsteered_centroid(const geometry::OrbitData& orbit, double t, double tau, double wavelength);

}  // namespace sar::sarfocuser

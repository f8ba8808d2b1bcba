#pragma once
// Processing stages as the job drivers call them. Stages that this build does not hold yet are
// reported as such and fail, so that a job stops cleanly at the first of them with the
// stage-failure code and the stage's name in the error record.
#include <array>
#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

#include "doppler/dcestconf.hpp"
#include "envisat/records.hpp"
#include "stripmap/procparm.hpp"
#include "stripmap/range_focus.hpp"

namespace sar::jobs {

/// The status a stage returns for a rejected input.
inline constexpr int kStageRejected = 10;

/// Name of the last stage that failed in this job (empty when none did).
const std::string& failed_stage();
void note_failed_stage(std::string_view name);

/// Report that a stage is not available in this build and return kStageRejected.
int stage_not_built(std::string_view name);

/// Stage flags of a stripmap job.
enum ImStage : std::size_t {
  kStageExtract = 0,
  kStageRangeFocus = 1,
  kStageCalibration = 2,
  kStageDoppler = 3,
  kStageAzimuth = 4,
  kStageSpare5 = 5,
  kStageCleanup = 6,
  kStageSpare7 = 7,
};
using StageFlags = std::array<int32_t, 8>;

using envisat::enviauxfiles;
using envisat::extconf;
using envisat::sarpar;
using stripmap::azimuthconf;
using stripmap::procparm;
using doppler::dcestconf;

/// Routes the focusing stages' progress to the host's progress bar.
void connect_stage_progress();

// Stages of the stripmap chain, in the order the IM job calls them.
/// Level 0 extraction of every channel of a product, each into its own line file (`extrPath`,
/// or `raw_file` when there are several), with the timeline table of the product's mode;
/// `extra` is the request and receives the side tables. A product with another number of
/// channels than `channels` holds ends the job with the bad-argument code.
int envi_extract(const enviauxfiles& files, std::vector<sarpar>& channels, extconf& extra);
int envi_orbit(const std::string& orbitPath, sarpar& par, procparm& proc);
int envi_rgpattern(const std::string& xcaPath, const std::string& insPath, sarpar& par, procparm& proc);
int envi_syntchirp(sarpar& par, procparm& proc);
int init_buffer(sarpar& par, procparm& proc);
int rangefoc(sarpar& par, procparm& proc);
/// Geometric centroid (Hz) at azimuth time t (sec85) and two-way time tau from the orbit and the
/// attitude law: two carried terms, the wavelength, p, q, r, s (degrees) and the azimuth offset.
int EstDopplerENVI(const std::string& orbitPath, double t, double tau, double term1, double term2, double wavelength,
                   double p, double q, double r, double s, double a, double& fdc);
/// Doppler centroid polynomial of the range-compressed image (file `input`, or the matrix in
/// core mode) into proc.dopplerCentroid, with its ambiguity.
int getnadcpoly(const std::string& input, dcestconf& conf, sarpar& par, procparm& proc);
/// The range slope of the centroid the orbit and the attitude law predict across the range-
/// compressed swath at azimuth time t, with its tolerance for conf.AttitudeErrorBound, into
/// conf. An orbit that cannot give it leaves the slope check off, with a warning.
void centroid_slope_band(const std::string& orbitPath, double t, const sarpar& par, const procparm& proc,
                         dcestconf& conf);
int getgeopoly(sarpar& par, procparm& proc);
int IMCalibration(sarpar& par, procparm& proc);
int azimuthfoc(sarpar& par, procparm& proc, azimuthconf& az);
int dest_buffer(sarpar& par, procparm& proc);
int dest_buffer(sarpar& par, procparm& proc, const stripmap::WrittenLines& written);
int get_coords(procparm& proc, sarpar& par);

}  // namespace sar::jobs

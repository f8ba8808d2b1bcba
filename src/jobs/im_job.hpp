#pragma once
// The stripmap IM job: parameter reading and the stage sequence.
#include <string>

#include "jobs/stages.hpp"

namespace sar::jobs {

inline constexpr std::string_view kImTitle = "Focussing ASAR IM";
inline constexpr std::string_view kImParameterFile = "parameters_IM.hdr";

/// Read sections "GeneralProcessingConf", "DCestConf" and "AzimuthConf". Every key but
/// `Report_level` is mandatory: a missing one ends the run with status 1.
int IMreadpars(const std::string& parameterFile, sarpar& par, procparm& proc, dcestconf& dc, azimuthconf& az,
               enviauxfiles& files, StageFlags& flags);

/// Run the stages that the flags ask for, in order. `extra` is the extraction request.
int IMprocessor(sarpar& par, procparm& proc, dcestconf& dc, azimuthconf& az, extconf& extra, enviauxfiles& files,
                StageFlags& flags);

/// GeoTIFF quick-look of a focused SLC (focused sizes and corners from `proc`). 0, or the
/// writer's status with the failed stage noted.
int write_quicklook(const std::string& slcPath, const std::string& tifPath, double scale, int width, int height,
                    const procparm& proc);
/// Directory part of a path: up to the last '/' or '\', "." when there is none.
std::string directory_of(const std::string& path);

}  // namespace sar::jobs

#pragma once
// The ENVISAT stripmap jobs: IM (one image) and AP (one image per polarisation).
#include <string>
#include <string_view>
#include <vector>

#include "jobs/stripmap_job.hpp"

namespace sar::jobs {

inline constexpr std::string_view kImTitle = "Focussing ASAR IM";
inline constexpr std::string_view kImParameterFile = "parameters_IM.hdr";

/// What the IM job is on the stripmap skeleton.
StripmapJobKind im_job_kind();
/// What the AP job is on the stripmap skeleton.
StripmapJobKind ap_job_kind();
/// Output words of the two images of an alternating polarisation level 0 product, in image
/// order ("hv", "hh" for APH); the bad-argument code with "ASA_AP0" for another product.
std::vector<std::string> ap_images(const std::string& level0Path);

}  // namespace sar::jobs

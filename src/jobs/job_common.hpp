#pragma once
// What every job driver does first: read the list and print the start banner.
#include <string>
#include <string_view>
#include <vector>

namespace sar::jobs {

/// Read the job arguments, refuse lists with fewer than 14 (banner with what there is, then
/// 456962), and print the start banner filled from the arguments at `bannerIndices`.
std::vector<std::string> start_job(const std::string& listPath, std::string_view title, std::string_view bannerFormat,
                                   std::initializer_list<std::size_t> bannerIndices);

/// Description directory (parameter files, catalogues, auxiliary index), ending in '/'.
std::string description_dir();

/// Refuse an input file that is named but missing, with 261122 and its name.
void require_existing(const std::string& path);

}  // namespace sar::jobs

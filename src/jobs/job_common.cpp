#include "jobs/job_common.hpp"

#include <cstdio>

#include "base/arguments.hpp"
#include "base/errors.hpp"
#include "base/run_services.hpp"
#include "jobs/drivers.hpp"

namespace sar::jobs {

std::vector<std::string> start_job(const std::string& listPath, std::string_view title, std::string_view bannerFormat,
                                   std::initializer_list<std::size_t> bannerIndices) {
  std::vector<std::string> args = base::GetJobArguments(listPath);
  if (args.size() < kMinJobArguments) {
    base::PrintStartBanner(args, title, nullptr);
    base::fatal(base::ec::kBadArguments);
  }
  // Fill the banner's %s fields in order.
  std::string text;
  auto index = bannerIndices.begin();
  for (std::size_t i = 0; i < bannerFormat.size(); ++i) {
    if (bannerFormat[i] == '%' && i + 1 < bannerFormat.size() && bannerFormat[i + 1] == 's' &&
        index != bannerIndices.end()) {
      text += args[*index++];
      ++i;
    } else {
      text.push_back(bannerFormat[i]);
    }
  }
  base::PrintStartBanner(args, title, &text);
  // Tell the host at once that the job runs, and honour a stop it asked for before we started.
  base::waitbar_open("Checking job inputs");
  return args;
}

std::string description_dir() { return base::directory_value("VANTERRA_CEOS_DES_FILES_DIR"); }

void require_existing(const std::string& path) {
  if (!base::FileExists(path)) base::fatal(base::ec::kFileNotFound, {path});
}

}  // namespace sar::jobs

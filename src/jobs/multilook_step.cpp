#include "jobs/multilook_step.hpp"

#include <charconv>
#include <filesystem>
#include <system_error>

#include "jobs/annotation.hpp"
#include "multilook/strip_multilook.hpp"

namespace sar::jobs {

namespace {

constexpr int kMostLooks = 64;

bool whole(std::string_view text, int& value) {
  const auto [end, ec] = std::from_chars(text.data(), text.data() + text.size(), value);
  return ec == std::errc() && end == text.data() + text.size() && value >= 1 && value <= kMostLooks;
}

}  // namespace

std::string parse_looks(const std::string& text, StripLooksChoice& choice) {
  if (text == "auto") {
    choice.azimuth = choice.range = 0;
    return {};
  }
  const auto x = text.find('x');
  int az = 0, rg = 0;
  if (x == std::string::npos || !whole(std::string_view(text).substr(0, x), az) ||
      !whole(std::string_view(text).substr(x + 1), rg))
    return "--multilook takes AZxRG (whole numbers from 1 to " + std::to_string(kMostLooks) + ") or auto, not '" +
           text + "'";
  choice.azimuth = az;
  choice.range = rg;
  return {};
}

std::string looks_text(const StripLooksChoice& choice) {
  if (choice.azimuth == 0 && choice.range == 0) return "auto";
  return std::to_string(choice.azimuth) + "x" + std::to_string(choice.range);
}

std::string looked_product_name(const std::string& stem, bool groundRange) {
  return stem + (groundRange ? "_gr" : "_pwr");
}

std::string multilook_slc(const std::string& slc, const std::string& output, const StripLooksChoice& choice) {
  multilook::StripMultilookRequest req;
  req.slc = slc;
  req.output = output;
  req.azimuthLooks = choice.azimuth;
  req.rangeLooks = choice.range;
  req.groundRange = choice.groundRange;
  req.groundStep = choice.groundStep;
  multilook::StripMultilookResult res;
  if (multilook::run_strip_multilook(req, res) != 0) return "multilook of " + slc + ": " + res.error;
  if (convert_annotation(output + "_hdr") != 0) {
    std::error_code ec;
    for (const char* suffix : {"", ".hdr", ".vrt", "_hdr", ".sml"}) std::filesystem::remove(output + suffix, ec);
    return "cannot write the description of " + output;
  }
  return {};
}

}  // namespace sar::jobs

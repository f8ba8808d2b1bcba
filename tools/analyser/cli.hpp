#pragma once
// The sarirf command: point target and power profile analysis of a complex raster.
//
//   sarirf RASTER [--target LINE,SAMPLE]... [--targets FILE] [--truth FILE]
//          [--first-line L] [--first-sample S] [--offset DLINE,DSAMPLE]
//          [--lines N] [--samples M] [--byte-order LSBFirst|MSBFirst] [--cell-type NAME]
//          [--header-offset BYTES] [--row-prefix BYTES]
//          [--azimuth-spacing M] [--range-spacing M]
//          [--oversample N] [--search N] [--neighbourhood N] [--cut N] [--max-cut N] [--islr-span R]
//          [--profiles] [--json FILE] [--plot PREFIX]
//
// Exit status: 0 when the analysis ran (targets that could not be measured are listed as
// such), 1 when an input cannot be read or an output cannot be written, 2 for a bad command.
#include <ostream>
#include <span>
#include <string>

namespace sar::analyser {

int run_sarirf(std::span<const std::string> args, std::ostream& out, std::ostream& err);

}  // namespace sar::analyser

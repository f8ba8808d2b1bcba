// The level 0 intake after the headers: the first and last packet search, the parameter
// statistic over the first packets, the timeline table, and the packet walk with FBAQ decoding.
// The decoding tables come from a real ASA_INS product, read once.
#include <vector>

#include "base/errors.hpp"
#include "envisat/extract.hpp"
#include "envisat/fbaq.hpp"
#include "envisat/table_builder.hpp"
#include "fuzz_support.hpp"

namespace {

const std::string kIns = std::string(SAR_REAL_DATA_DIR) +
                         "/ASA_INS_AX/ASA_INS_AXVIEC20101222_143805_20101022_000000_20141231_235959";

struct Tables {
  sar::envisat::FbaqTables fbaq;
  std::vector<float> gains = std::vector<float>(sar::envisat::kGainTableLength);
  Tables() {
    sar::envisat::LUTfbaq_f(kIns, fbaq.q, fbaq.i);
    sar::envisat::read_gain_table(kIns, gains);
  }
};

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  static const Tables tables;
  const std::string path = sar::fuzz::input_file(data, size, "ASA_IM__0P.N1");
  const std::string dir = sar::fuzz::scratch_dir().string();
  try {
    const auto header = sar::envisat::read_level0_header(path);
    std::vector<sar::envisat::sarpar> channels(static_cast<std::size_t>(header.channels));
    for (std::size_t c = 0; c < channels.size(); ++c) {
      channels[c].outputDir = dir;
      channels[c].extrPath = dir + "/EXTR" + std::to_string(c);
    }
    sar::envisat::LineTable table;
    if (sar::envisat::timeline_table_builder()(path, kIns, header.mode, table, channels) != 0) return 0;
    sar::envisat::extconf conf;
    sar::envisat::extract_level0(path, header, table, tables.fbaq, tables.gains, channels, conf);
  } catch (const sar::base::CErrorExceptionManager&) {
  }
  return 0;
}

// What the readers say about a bad input file: one error type that names the fault, the file,
// and the code the host would get, whichever reader and whichever file it is.
#include <gtest/gtest.h>

#include <filesystem>
#include <fstream>
#include <functional>

#include "base/errors.hpp"
#include "envisat/aux_products.hpp"
#include "envisat/level0_format.hpp"
#include "geometry/orbit_file.hpp"

namespace fs = std::filesystem;
using sar::base::InputError;
using sar::base::InputFault;
namespace ec = sar::base::ec;

namespace {

const fs::path kReal = SAR_REAL_DATA_DIR;

std::string first_in(const char* folder) {
  for (const auto& e : fs::directory_iterator(kReal / folder)) return e.path().string();
  return {};
}

// The first `bytes` of a real file in a scratch copy.
std::string cut_copy(const std::string& from, std::size_t bytes, const std::string& name) {
  const fs::path to = fs::temp_directory_path() / ("input_errors_" + std::to_string(::getpid()) + "_" + name);
  std::ifstream in(from, std::ios::binary);
  std::string data(bytes, '\0');
  in.read(data.data(), static_cast<std::streamsize>(bytes));
  data.resize(static_cast<std::size_t>(in.gcount()));
  std::ofstream(to, std::ios::binary) << data;
  return to.string();
}

TEST(InputErrors, EveryReaderNamesTheFaultTheFileAndTheCode) {
  const std::string im0 = first_in("ASA_IM__0P_truncated");
  const std::string ins = first_in("ASA_INS_AX");
  const std::string xca = first_in("ASA_XCA_AX");
  const std::string vor = first_in("DOR_VOR_AX");
  const std::string shortIm = cut_copy(im0, 2000, "short_im");
  const std::string shortVor = cut_copy(vor, 1500, "short_vor");
  struct Row {
    const char* name;
    std::string file;
    std::function<void()> read;
    InputFault fault;
    int code;
  };
  const Row rows[] = {
      {"level 0 product missing", "/nowhere/ASA_IM__0P.N1",
       [] { sar::envisat::read_level0_header("/nowhere/ASA_IM__0P.N1"); }, InputFault::kMissing, ec::kImageMissing},
      {"ASA_INS given as level 0", ins, [&] { sar::envisat::read_level0_header(ins); }, InputFault::kWrongType,
       ec::kBadArguments},
      {"level 0 cut inside its headers", shortIm, [&] { sar::envisat::read_level0_header(shortIm); },
       InputFault::kTruncated, ec::kFileIo},
      {"level 0 given as ASA_XCA", im0, [&] { sar::envisat::XcaRecord::read(im0); }, InputFault::kWrongType,
       ec::kBadArguments},
      {"ASA_XCA given as orbit", xca, [&] { sar::geometry::read_orbit(xca); }, InputFault::kWrongType,
       ec::kBadArguments},
      {"orbit cut inside its records", shortVor, [&] { sar::geometry::read_orbit(shortVor); }, InputFault::kMissing,
       ec::kFileIo},
  };
  for (const Row& row : rows) {
    SCOPED_TRACE(row.name);
    try {
      row.read();
      ADD_FAILURE() << "read without an error";
    } catch (const InputError& e) {
      EXPECT_EQ(e.fault(), row.fault) << e.what();
      EXPECT_EQ(e.host_code(), row.code) << e.what();
      // The record's first detail is the file, for the host and the operator alike.
      EXPECT_EQ(e.file(), row.file) << e.what();
      EXPECT_FALSE(std::string(e.what()).empty());
    } catch (const sar::base::CErrorExceptionManager& e) {
      ADD_FAILURE() << "a host error that is no input error: " << e.ec() << " " << e.detail();
    }
  }
  fs::remove(shortIm);
  fs::remove(shortVor);
}

}  // namespace

// Profile parameter files, read through every typed reader the jobs use.
#include <array>
#include <vector>

#include "base/errors.hpp"
#include "base/profile.hpp"
#include "fuzz_support.hpp"

using namespace sar::base;

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  const std::string path = sar::fuzz::input_file(data, size, "parameters_IM.hdr");
  FreeProfile();
  try {
    std::string s;
    GetMyProfileString("GeneralProcessingConf", "Report_level", s, 512, path);
    std::array<int32_t, 4> i32{};
    GetMyProfileIntArray("GeneralProcessingConf", "Azblk", i32, path);
    std::array<int64_t, 2> i64{};
    GetMyProfileInt64Array("DCestConf", "Memory", i64, path);
    std::array<long, 2> l{};
    GetMyProfileLongArray("DCestConf", "Blocks", l, path);
    std::array<float, 3> f{};
    GetMyProfileFloatArray("DCestConf", "RgBand", f, path);
    std::array<double, 9> d{};
    GetProfileDoubleArray("AzimuthConf", "DCpoly", d, path);
    std::array<double, 12> m{};
    GetMyProfileDoubleMatrix("AzimuthConf", "Matrix", m, 3, 4, path);
    std::vector<std::string> strings;
    GetMyProfileStringArray("ASA_INS_0", "FileName", strings, 3, path, 512);
    GetMyProfileStringMatrix("ASA_INS_0", "Names", strings, 2, 2, path, 64);
    GetParDouble(path, "Kthr", std::span<double>(d.data(), 2), "DCestConf");
  } catch (const CErrorExceptionManager&) {
  } catch (const ProcessExit&) {
  }
  FreeProfile();
  return 0;
}

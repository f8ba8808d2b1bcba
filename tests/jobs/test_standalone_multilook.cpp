// sarfocus im --multilook: the SLC of a small simulated scene and its multilooked image side by
// side, in the output folder only once both stand; the looks keep the SLC's power and put its
// target where the looked grid says.
#include <gtest/gtest.h>

#include <cmath>
#include <complex>
#include <cstring>

#include "jobs/multilook_step.hpp"
#include "test_standalone_support.hpp"

using namespace sar::test;
using namespace sar::jobs;

namespace {

template <class T>
std::vector<T> raster(const fs::path& p) {
  const std::string bytes = slurp(p);
  std::vector<T> v(bytes.size() / sizeof(T));
  std::memcpy(v.data(), bytes.data(), v.size() * sizeof(T));
  return v;
}

int key_int(const fs::path& annotation, const std::string& key) {
  for (const auto& l : lines_of(annotation))
    if (l.rfind(key + " = ", 0) == 0) return std::atoi(l.c_str() + key.size() + 3);
  return -1;
}

}  // namespace

TEST(SarfocusMultilook, LookOptionsAreCheckedBeforeAnythingRuns) {
  struct Case {
    std::string text;
    bool ok;
    int az, rg;
  } cases[] = {{"3x2", true, 3, 2}, {"auto", true, 0, 0}, {"1x1", true, 1, 1}, {"0x2", false, 0, 0},
               {"3x", false, 0, 0}, {"3*2", false, 0, 0}, {"65x1", false, 0, 0}, {"2x2x2", false, 0, 0}};
  for (const auto& c : cases) {
    StripLooksChoice looks;
    const std::string why = parse_looks(c.text, looks);
    EXPECT_EQ(why.empty(), c.ok) << c.text << ": " << why;
    if (c.ok) {
      EXPECT_EQ(looks.azimuth, c.az);
      EXPECT_EQ(looks.range, c.rg);
      EXPECT_EQ(looks_text(looks), c.text);
    }
  }
  ScratchJob job("sarfocus_looks_bad");
  const auto t = simulate_small(job.dir() / "in", "14-MAR-2008 10:00:00.000000");
  const std::string out = (job.dir() / "out").string();
  for (const auto& args : std::vector<std::vector<std::string>>{
           {"im", t.level0_path, "--multilook", "0x2", "--out", out},
           {"ws", t.level0_path, "--multilook", "2x2", "--out", out},
           {"im", t.level0_path, "--ground-range", "--out", out}}) {
    const CliResult r = sarfocus(args);
    EXPECT_EQ(r.status, kExitBadRequest) << args[2] << " " << r.err;
    EXPECT_FALSE(fs::exists(out + "/.sarfocus")) << args[2];
  }
}

TEST(SarfocusMultilook, LooksOfTheFocusedSceneBesideItsSlc) {
  ScratchJob job("sarfocus_looks");
  const auto t = simulate_small(job.dir() / "in", "14-MAR-2008 10:00:00.000000");
  const std::string in = (job.dir() / "in").string(), out = (job.dir() / "out").string();
  std::vector<std::string> args = {"im", t.level0_path, "--orbit", in, "--aux", in, "--out", out,
                                   "--no-quicklook", "--multilook", "4x2"};
  for (const auto& p : kSmallSceneParams) {
    args.push_back("--param");
    args.push_back(p);
  }
  const CliResult r = sarfocus(args);
  ASSERT_EQ(r.status, 0) << r.err;
  const std::string stem = product_stem(t.level0_path);
  const fs::path slc = fs::path(out) / (stem + "_slc"), pwr = fs::path(out) / (stem + "_pwr");
  for (const char* suffix : {"", ".hdr", ".vrt", "_hdr", ".sml"})
    EXPECT_TRUE(fs::exists(pwr.string() + suffix)) << suffix;
  const int lines = key_int(slc.string() + "_hdr", "NrOfLinesPerImage");
  const int samples = key_int(slc.string() + "_hdr", "NrOfPixelsPerLine");
  const int mlLines = key_int(pwr.string() + "_hdr", "NrOfLinesPerImage");
  const int mlSamples = key_int(pwr.string() + "_hdr", "NrOfPixelsPerLine");
  ASSERT_GT(lines, 0);
  EXPECT_EQ(mlLines, (lines + 3) / 4);
  EXPECT_EQ(mlSamples, (samples + 1) / 2);
  EXPECT_EQ(key_int(pwr.string() + "_hdr", "NAzimuthLooks"), 4);
  EXPECT_EQ(key_int(pwr.string() + "_hdr", "NRangeLooks"), 2);

  const auto z = raster<std::complex<float>>(slc);
  const auto a = raster<float>(pwr);
  ASSERT_EQ(z.size(), static_cast<std::size_t>(lines) * samples);
  ASSERT_EQ(a.size(), static_cast<std::size_t>(mlLines) * mlSamples);
  double p0 = 0.0, p1 = 0.0;
  std::size_t peak0 = 0, peak1 = 0;
  for (std::size_t i = 0; i < z.size(); ++i) {
    p0 += std::norm(z[i]);
    if (std::norm(z[i]) > std::norm(z[peak0])) peak0 = i;
  }
  for (std::size_t i = 0; i < a.size(); ++i) {
    p1 += static_cast<double>(a[i]) * a[i];
    if (a[i] > a[peak1]) peak1 = i;
  }
  // Power: the partial looks at the far ends count as whole ones in the sums, so compare means.
  const double db = 10.0 * std::log10((p1 / a.size()) / (p0 / z.size()));
  EXPECT_LT(std::fabs(db), 0.1) << db;
  // The target's brightest look holds its brightest SLC cell.
  const double line0 = static_cast<double>(peak0 / samples), sample0 = static_cast<double>(peak0 % samples);
  EXPECT_NEAR(static_cast<double>(peak1 / mlSamples), (line0 - 1.5) / 4.0, 0.5 + 1e-9);
  EXPECT_NEAR(static_cast<double>(peak1 % mlSamples), (sample0 - 0.5) / 2.0, 0.5 + 1e-9);

  const CliResult info = shell("command -v gdalinfo >/dev/null && gdalinfo " + pwr.string() + ".vrt 2>&1");
  if (!info.out.empty()) {
    EXPECT_NE(info.out.find("Type=Float32"), std::string::npos) << info.out;
  }

  // Complete only with the looked image there too.
  StandaloneRequest req;
  req.mode = "im";
  req.product = t.level0_path;
  req.outDir = out;
  req.quickLook = false;
  req.multilook = "4x2";
  EXPECT_TRUE(outputs_complete(req));
  fs::remove(pwr);
  EXPECT_FALSE(outputs_complete(req));

}

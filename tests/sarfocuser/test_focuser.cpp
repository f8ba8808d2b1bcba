// Simulated RADARSAT-1 scenes through extraction and the raw-data focuser: point targets where
// their zero-Doppler times and ranges put them, with the widths and sidelobes the processed
// bands predict.
#include <gtest/gtest.h>

#include <cmath>
#include <complex>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <unistd.h>

#include "analyser/irf.hpp"
#include "radarsat/extract.hpp"
#include "sarfocuser/sarfocuser.hpp"
#include "simulator/rsat_product.hpp"

namespace fs = std::filesystem;
namespace rs = sar::simulator::rsat;
using namespace sar;

namespace {

struct Focused {
  fs::path dir;
  rs::RsatTruth truth;
  radarsat::Acquisition acq;
  std::unique_ptr<sarfocuser::SARFocuser> focuser;
  std::vector<std::complex<float>> slc;
  int status = -1;

  Focused(const std::string& name, rs::RsatConfig c, bool unweighted) {
    dir = fs::temp_directory_path() / ("rsat_focus_" + name + "_" + std::to_string(::getpid()));
    fs::remove_all(dir);
    c.out_dir = dir.string();
    truth = rs::simulate_rsat(c);
    radarsat::ExtractRequest rq;
    rq.data_file = truth.data_path;
    rq.leader_file = truth.leader_path;
    rq.raw_path = (dir / "RAW").string();
    rq.chirp_path = (dir / "CHIRP").string();
    acq = radarsat::radar_extract(rq);
    sarfocuser::SARFocuser_conf conf;
    conf.readconf(std::string(SAR_DATA_DIR) + "/parameters_RS.hdr");
    if (unweighted) {
      conf.az.RangeWindowHammingParameter = 0.0;
      conf.az.AzimuthWindowHammingParameter = 0.0;
    }
    focuser = std::make_unique<sarfocuser::SARFocuser>(conf, sarfocuser::SARFocuser_input{rq.raw_path, rq.chirp_path, ""},
                                                       sarfocuser::SARFocuser_output{(dir / "scene_slc").string()}, acq);
    status = focuser->run();
    if (status != 0) return;
    const auto& p = focuser->proc();
    slc.resize(static_cast<std::size_t>(p.focusedLines) * p.focusedSamples);
    std::ifstream in(dir / "scene_slc", std::ios::binary);
    in.read(reinterpret_cast<char*>(slc.data()), static_cast<std::streamsize>(slc.size() * 8));
    if (!in) status = -2;
  }
  ~Focused() { fs::remove_all(dir); }

  /// Expected SLC position of target i from its zero-Doppler time and range.
  std::pair<double, double> expected(std::size_t i) const {
    const auto& p = focuser->proc();
    const auto& t = truth.targets[i];
    return {(t.zero_doppler_time - p.firstLineTime) * truth.prf, (t.range_time - p.firstSampleTime) * truth.sampling_frequency};
  }

  analyser::IrfMeasure measure(std::size_t i) const {
    const auto& p = focuser->proc();
    analyser::ComplexImageView view{slc, p.focusedLines, p.focusedSamples, p.focusedSamples, 0, 0};
    const auto [line, sample] = expected(i);
    return analyser::measure_point(view, line, sample, analyser::AnalyserOptions{});
  }
};

rs::RsatConfig scene(const std::string& beam) {
  rs::RsatConfig c;
  c.beam = beam;
  c.lines = 2560;
  c.samples = beam == "F1" ? 3072 : 2048;
  c.noise_db = 0.0;
  c.targets = {{{45.0, 10.0, 0.0}, 3.0}};
  return c;
}

}  // namespace

TEST(Focuser, PointTargetsOfBothBeamsUnweighted) {
  struct Case {
    const char* beam;
    double rangeWidth;  // 0.886 fs / B
  };
  for (const Case& c : {Case{"F1", 0.954}, Case{"S3", 0.946}}) {
    SCOPED_TRACE(c.beam);
    Focused f(std::string(c.beam) + "_plain", scene(c.beam), true);
    ASSERT_EQ(f.status, 0) << f.focuser->failed_stage();
    const auto m = f.measure(0);
    ASSERT_TRUE(m.valid) << m.problem;
    const auto [line, sample] = f.expected(0);
    std::printf("%s: centroid %.1f Hz (truth %.1f), peak %.3f %.3f expected %.3f %.3f, widths rg %.3f az %.3f, "
                "PSLR rg %.2f az %.2f dB, ISLR rg %.2f az %.2f dB\n",
                c.beam, f.focuser->centroid(), f.truth.targets[0].doppler_centroid, m.peak_line, m.peak_sample, line, sample,
                m.res_rg_px, m.res_az_px, m.pslr_rg_db, m.pslr_az_db, m.islr_rg_db, m.islr_az_db);
    EXPECT_NEAR(m.peak_line, line, 0.1);
    EXPECT_NEAR(m.peak_sample, sample, 0.1);
    EXPECT_NEAR(m.res_rg_px, c.rangeWidth, 0.05 * c.rangeWidth);
    EXPECT_NEAR(m.pslr_rg_db, -13.3, 1.0);
  }
}

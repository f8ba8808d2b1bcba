// Simulated RADARSAT-1 products through the reader: the acquisition the extraction finds is the
// one the simulator wrote, and a point target compresses in range where its truth says.
#include <gtest/gtest.h>

#include <cmath>
#include <complex>
#include <filesystem>
#include <fstream>
#include <unistd.h>

#include "radarsat/extract.hpp"
#include "simulator/rsat_product.hpp"

namespace fs = std::filesystem;
using namespace sar::radarsat;
namespace rs = sar::simulator::rsat;

namespace {

struct Scene {
  fs::path dir;
  rs::RsatTruth truth;
  Acquisition acq;
  Scene(const std::string& beam, int samples, rs::RsatConfig c = {}) {
    dir = fs::temp_directory_path() / ("rsat_sim_" + beam + "_" + std::to_string(::getpid()));
    fs::remove_all(dir);
    c.out_dir = dir.string();
    c.beam = beam;
    c.lines = 1536;
    c.samples = samples;
    c.targets = {{{45.0, 10.0, 0.0}, 4.0}};
    truth = rs::simulate_rsat(c);
    ExtractRequest rq;
    rq.data_file = truth.data_path;
    rq.leader_file = truth.leader_path;
    rq.raw_path = (dir / "RAW").string();
    rq.chirp_path = (dir / "CHIRP").string();
    acq = radar_extract(rq);
  }
  ~Scene() { fs::remove_all(dir); }
};

/// Peak of the correlation of one raw line with the ideal chirp, in samples (parabolic).
double range_peak(const std::string& rawPath, int samples, int line, double fs, double bandwidth) {
  std::ifstream in(rawPath, std::ios::binary);
  in.seekg(static_cast<std::streamoff>(line) * (4 + 8 * static_cast<std::streamoff>(samples)) + 4);
  std::vector<std::complex<float>> x(static_cast<std::size_t>(samples));
  in.read(reinterpret_cast<char*>(x.data()), 8 * samples);
  const double tp = 4.2e-5, k = bandwidth / tp;
  const int n = static_cast<int>(tp * fs);
  std::vector<double> power(static_cast<std::size_t>(samples - n), 0.0);
  for (int lag = 0; lag < samples - n; ++lag) {
    std::complex<double> acc = 0.0;
    for (int i = 0; i < n; ++i) {
      const double u = i / fs - tp / 2;
      acc += std::complex<double>(x[static_cast<std::size_t>(lag + i)]) * std::polar(1.0, -3.14159265358979 * k * u * u);
    }
    power[static_cast<std::size_t>(lag)] = std::norm(acc);
  }
  const auto best = static_cast<int>(std::max_element(power.begin(), power.end()) - power.begin());
  const double a = power[best - 1], b = power[best], c = power[best + 1];
  return best + 0.5 * (a - c) / (a - 2 * b + c);
}

}  // namespace

TEST(SimulatedProduct, ExtractionFindsWhatTheSimulatorWrote) {
  for (const auto& [beam, samples] : {std::pair{"F1", 2048}, std::pair{"S3", 1024}}) {
    SCOPED_TRACE(beam);
    Scene s(beam, samples);
    EXPECT_EQ(s.acq.beam, beam);
    EXPECT_EQ(s.acq.samples, samples);
    EXPECT_EQ(s.acq.lines, 1536);
    EXPECT_NEAR(s.acq.prf, s.truth.prf, 1e-9);
    EXPECT_NEAR(s.acq.prf, 1257.0, 1.0);
    EXPECT_NEAR(s.acq.sampling_rate, s.truth.sampling_frequency, 1e-3);
    EXPECT_NEAR(s.acq.near_range_time, s.truth.near_range_time, 1e-12);
    EXPECT_NEAR(s.acq.first_line_time, s.truth.first_line_time, 1e-6);
    EXPECT_EQ(s.acq.replicas, 24);
    // A centroid of several PRFs, as Earth rotation gives an unsteered beam.
    EXPECT_GT(std::abs(s.truth.doppler_centroid), 3.0 * s.truth.prf);
    // The echo's leading edge where the truth puts it, on the line of the beam-centre crossing.
    const auto& t = s.truth.targets[0];
    const int line = static_cast<int>(std::lround((t.beam_centre_time - s.truth.first_line_time) * s.truth.prf));
    ASSERT_GT(line, 0);
    ASSERT_LT(line, 1536);
    const double edge = (t.beam_centre_range_time - s.truth.near_range_time) * s.truth.sampling_frequency;
    const double peak = range_peak((s.dir / "RAW").string(), samples, line, s.truth.sampling_frequency, s.truth.beam.bandwidth);
    EXPECT_NEAR(peak, edge, 0.3);  // a parabola on an unpadded peak is good to a few tenths
    // The range there is longer than at zero Doppler: tens of samples of migration.
    EXPECT_GT(edge - (t.range_time - s.truth.near_range_time) * s.truth.sampling_frequency, 10.0);
  }
}

TEST(SimulatedProduct, FaultsAreSeenByTheReader) {
  rs::RsatConfig c;
  c.gap_line = 700;
  c.gap_length = 5;
  c.swst_change_line = 900;
  c.swst_change_counts = 20;
  c.attenuation_step_line = 1000;
  c.attenuation_step_db = 6;
  c.repeated_index_line = 1200;
  Scene s("S3", 1024, c);
  EXPECT_EQ(s.acq.lines, 1536);  // the gap is filled, the repeated record dropped and refilled
  EXPECT_EQ(s.acq.missing_lines, 6);
  EXPECT_EQ(s.acq.dropped_records, 1);
  EXPECT_EQ(s.acq.missing[702], 1);
  EXPECT_EQ(s.acq.missing[1200], 1);
  EXPECT_EQ(s.acq.swst[899], s.truth.swst_count);
  EXPECT_EQ(s.acq.swst[900], s.truth.swst_count + 20);
  EXPECT_NEAR(s.acq.far_range_time - s.acq.near_range_time, 20 * 3.2491e-07, 1e-12);
  EXPECT_EQ(s.acq.reference_attenuation, 10);
}

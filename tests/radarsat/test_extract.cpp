// Extraction of small hand-made data sets: line bookkeeping, gains, replica, skip and extract,
// and every refusal of a broken data set with the file named and nothing left behind.
#include <gtest/gtest.h>

#include <chrono>
#include <cstdio>
#include <cmath>
#include <complex>
#include <filesystem>
#include <fstream>
#include <functional>
#include <future>
#include <unistd.h>

#include "io/general_sar.hpp"
#include "radarsat/extract.hpp"
#include "simulator/orbit_model.hpp"
#include "simulator/rsat_product.hpp"

namespace fs = std::filesystem;
using namespace sar::radarsat;
namespace sim = sar::simulator;
using sim::rsat::DataRecord;

namespace {

constexpr int kSamples = 16;       // D = 2
constexpr int kAdc = 2;            // 1152 replica bytes
constexpr double kVectorsStart = 530000000.0 - 300.0;
constexpr double kFirstLine = 530000000.0;

struct Product {
  fs::path dir;
  ExtractRequest request;
  explicit Product(const std::string& name) {
    dir = fs::temp_directory_path() / ("rsat_extract_" + name + "_" + std::to_string(::getpid()));
    fs::remove_all(dir);
    fs::create_directories(dir);
    request.data_file = (dir / "dat_01.001").string();
    request.leader_file = (dir / "lea_01.001").string();
    request.raw_path = (dir / "RAW").string();
    request.chirp_path = (dir / "CHIRP").string();
  }
  ~Product() { fs::remove_all(dir); }
  void leader(int vectors = 21, const std::string& mission = "R1", const std::string& sensor = "RSAT-1-C -    -HH") const {
    const auto orbit = sim::OrbitModel::for_scene({45.0, 10.0, 0.0}, kFirstLine, 38.0, false, 30000);
    auto content = sim::rsat::leader_from_orbit(orbit, kVectorsStart, vectors, 30.0, 12.0);
    content.mission = mission;
    content.sensor = sensor;
    sim::rsat::write_leader(request.leader_file, content);
  }
  bool outputs_absent() const {
    for (const auto& e : fs::directory_iterator(dir)) {
      const std::string n = e.path().filename().string();
      if (n != "dat_01.001" && n != "lea_01.001") return false;
    }
    return true;
  }
};

/// A record of line index `index`: I of sample k is the level of (index % 8) + 0.5, Q -0.5.
DataRecord record(int64_t index, bool replica = false) {
  DataRecord r;
  r.line_index = index;
  r.aux.adc_code = kAdc;
  r.aux.bandwidth_code = 2;
  r.aux.beam_code = 3;  // S3, 8 pulses in flight
  r.aux.pri_count = 1700;
  r.aux.swst_count = 100;
  r.aux.rx_duration = 2;
  r.aux.attenuation = 10;
  const double tod = kFirstLine - std::floor(kFirstLine / 86400.0) * 86400.0 + (index - 1) * 1e-3;
  const long long ticks = std::llround(tod / 0.0009765625e-3);
  r.aux.fraction = static_cast<int>(ticks % 1024);
  r.aux.milliseconds = static_cast<int>(ticks / 1024 % 1000);
  r.aux.seconds = static_cast<int>(ticks / 1024000);
  r.echo.resize(2 * kSamples);
  for (int k = 0; k < kSamples; ++k) {
    r.echo[2 * k] = static_cast<uint8_t>(index % 8);
    r.echo[2 * k + 1] = 0x0F;
  }
  if (replica) r.replica.assign(1152, 0x01);
  return r;
}

std::vector<DataRecord> records(std::initializer_list<int64_t> indices) {
  std::vector<DataRecord> out;
  for (int64_t i : indices) out.push_back(record(i, out.empty()));
  return out;
}

struct RawLine {
  float time;
  std::vector<std::complex<float>> samples;
};

std::vector<RawLine> read_raw(const std::string& path, int samples) {
  std::ifstream in(path, std::ios::binary);
  std::vector<RawLine> lines;
  RawLine l;
  l.samples.resize(static_cast<std::size_t>(samples));
  while (in.read(reinterpret_cast<char*>(&l.time), 4) &&
         in.read(reinterpret_cast<char*>(l.samples.data()), static_cast<std::streamsize>(8 * samples)))
    lines.push_back(l);
  return lines;
}

}  // namespace

TEST(Extract, LinesReplicaAndAcquisition) {
  Product p("plain");
  p.leader();
  auto recs = records({1, 2, 3, 4, 5, 6, 7, 8, 9, 10});
  recs[5].replica.assign(1152, 0x02);
  sim::rsat::write_data_file(p.request.data_file, recs);
  const Acquisition a = radar_extract(p.request);
  EXPECT_EQ(a.lines, 10);
  EXPECT_EQ(a.samples, kSamples);
  EXPECT_EQ(a.beam, "S3");
  EXPECT_EQ(a.replicas, 2);
  EXPECT_EQ(a.replica_samples, 576);
  EXPECT_EQ(a.pulse_bandwidth, 11580000.0);
  EXPECT_NEAR(a.prf, 1.0 / (1702 * 4.6415e-07), 1e-9);
  EXPECT_NEAR(a.near_range_time, 105 * 4.6415e-07 - 4.2e-06 + 8 / a.prf, 1e-15);
  EXPECT_NEAR(a.first_line_time, kFirstLine, 1e-6);
  const auto raw = read_raw(p.request.raw_path, kSamples);
  ASSERT_EQ(raw.size(), 10u);
  for (int l = 0; l < 10; ++l) {
    EXPECT_EQ(raw[l].samples[3], std::complex<float>((l + 1) % 8 + 0.5f, -0.5f)) << l;
    EXPECT_FLOAT_EQ(raw[l].time, static_cast<float>(a.near_range_time));
  }
  // Replicas of levels 1.5 and 2.5 average to 2.
  std::ifstream chirp(p.request.chirp_path, std::ios::binary);
  std::vector<std::complex<float>> c(576);
  chirp.read(reinterpret_cast<char*>(c.data()), 576 * 8);
  ASSERT_TRUE(chirp);
  EXPECT_EQ(c[0], std::complex<float>(2.0f, 2.0f));
  EXPECT_EQ(c[575], std::complex<float>(2.0f, 2.0f));

  // The description beside the rasters: a raw set a focuser can start from.
  sar::io::GeneralRAWData d;
  ASSERT_EQ(d.readhdr(p.request.raw_path), 0);
  EXPECT_EQ(d.dataFile.lines, 10);
  EXPECT_EQ(d.dataFile.pixels, kSamples);
  EXPECT_EQ(d.dataFile.rowPrefix, 4);
  EXPECT_NEAR(d.roi.slowStart, a.first_line_time, 1e-6);
  EXPECT_NEAR(d.roi.fastStart, a.near_range_time, 1e-15);
  EXPECT_NEAR(d.sampling.prf_hz, a.prf, 1e-9);
  EXPECT_EQ(d.pulse.Bandwidth, 11580000.0);
  EXPECT_EQ(d.info.Swath, "S3");
  EXPECT_EQ(d.info.SensorName, "RADARSAT-1");
  EXPECT_EQ(d.swath.Rank, a.pulses_in_flight);
  EXPECT_EQ(d.stateVectors.nStateVectors, 21);  // every vector of the leader
  EXPECT_EQ(d.stateVectors.TimeDelta, 30.0);
  EXPECT_NEAR(d.stateVectors.pos[60], a.orbit.vectors[20].position[0], 1e-6);
  sar::io::DataFile replica;
  ASSERT_EQ(replica.read_hdr(p.request.chirp_path), 0);
  EXPECT_EQ(replica.pixels, 576);
}

TEST(Extract, UnwritableDescriptionLeavesNothingBehind) {
  Product p("nodesc");
  p.leader();
  auto recs = records({1, 2, 3, 4});
  recs[0].replica.assign(1152, 0x02);
  sim::rsat::write_data_file(p.request.data_file, recs);
  fs::create_directories(p.request.raw_path + ".hdr");  // in the way of the header
  try {
    radar_extract(p.request);
    ADD_FAILURE() << "accepted";
  } catch (const CeosError& e) {
    EXPECT_EQ(std::string(e.what()).rfind(p.request.raw_path + ".hdr: ", 0), 0u) << e.what();
  }
  fs::remove(p.request.raw_path + ".hdr");
  EXPECT_TRUE(p.outputs_absent());
}

TEST(Extract, LineIndexBookkeeping) {
  struct Case {
    const char* name;
    std::vector<DataRecord> recs;
    std::vector<int32_t> sequence;  // 0 for a zero line
    int64_t dropped;
  };
  const Case cases[] = {
      {"gap of three", records({1, 2, 3, 7, 8}), {1, 2, 3, 0, 0, 0, 7, 8}, 0},
      {"repeated index", records({1, 2, 3, 3, 4, 5}), {1, 2, 3, 4, 5}, 1},
      {"backward index", records({1, 2, 3, 4, 2, 5}), {1, 2, 3, 4, 5}, 1},
      {"file numbering from 100", records({100, 101, 103}), {100, 101, 0, 103}, 0},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    Product p("index");
    p.leader();
    sim::rsat::write_data_file(p.request.data_file, c.recs);
    // A repeated index once looped for ever; the walk must end on its own.
    auto done = std::async(std::launch::async, [&] { return radar_extract(p.request); });
    ASSERT_EQ(done.wait_for(std::chrono::seconds(20)), std::future_status::ready) << "extraction hangs";
    const Acquisition a = done.get();
    EXPECT_EQ(a.sequence, c.sequence);
    EXPECT_EQ(a.dropped_records, c.dropped);
    const auto raw = read_raw(p.request.raw_path, kSamples);
    ASSERT_EQ(raw.size(), c.sequence.size());
    for (std::size_t l = 0; l < raw.size(); ++l) {
      EXPECT_EQ(a.missing[l], c.sequence[l] == 0 ? 1 : 0);
      if (c.sequence[l] == 0) {
        EXPECT_EQ(raw[l].samples[0], std::complex<float>(0.0f, 0.0f));
        EXPECT_EQ(raw[l].time, raw[l - 1].time);  // a zero line carries the last time
      } else {
        EXPECT_EQ(raw[l].samples[0].real(), c.sequence[l] % 8 + 0.5f);
      }
    }
  }
}

TEST(Extract, AttenuationStepSwstChangeSkipAndExtract) {
  Product p("gain");
  p.leader();
  auto recs = records({1, 2, 3, 4, 5, 6, 7, 8});
  for (std::size_t i = 4; i < recs.size(); ++i) {
    recs[i].aux.attenuation = 16;  // 6 dB more from the fifth line
    recs[i].aux.swst_count = 140;  // and a later window
  }
  sim::rsat::write_data_file(p.request.data_file, recs);
  p.request.lines_to_skip = 2;
  p.request.lines_to_extract = 5;
  const Acquisition a = radar_extract(p.request);
  EXPECT_EQ(a.lines, 5);
  EXPECT_EQ(a.sequence, (std::vector<int32_t>{3, 4, 5, 6, 7}));
  EXPECT_EQ(a.reference_attenuation, 10);
  EXPECT_EQ(a.swst, (std::vector<int32_t>{100, 100, 140, 140, 140}));
  EXPECT_NEAR(a.far_range_time - a.near_range_time, 40 * 4.6415e-07, 1e-12);
  EXPECT_NEAR(a.first_line_time, kFirstLine + 2e-3, 1e-6);  // the time of the third record
  const auto raw = read_raw(p.request.raw_path, kSamples);
  ASSERT_EQ(raw.size(), 5u);
  EXPECT_FLOAT_EQ(raw[1].samples[0].real(), 4.5f);
  EXPECT_NEAR(raw[2].samples[0].real(), 5.5 * std::pow(10.0, 0.3), 1e-4);  // brought back to 10 dB
  EXPECT_NEAR(raw[2].time - raw[1].time, 40 * 4.6415e-07, 1e-9);
}

TEST(Extract, TextOrbitReplacesTheLeadersVectors) {
  Product p("text_orbit");
  p.leader(4);  // too few for an orbit of its own
  sim::rsat::write_data_file(p.request.data_file, records({1, 2, 3}));
  // The same orbit as a text orbit: inertial metres, the Greenwich angle in radians.
  const auto orbit = sim::OrbitModel::for_scene({45.0, 10.0, 0.0}, kFirstLine, 38.0, false, 30000);
  const auto content = sim::rsat::leader_from_orbit(orbit, kVectorsStart, 21, 30.0, 12.0);
  std::ofstream text(p.dir / "orbit.txt");
  text << "GENERATION TIME: simulated\nORBIT NUMBER: 30000\n; comment\n";
  char line[200];
  std::snprintf(line, sizeof line, "GREENWICH ANGLE: %.15f\n", 12.0 * M_PI / 180.0);
  text << line << "1ST MODEL\n2ND MODEL\n";
  for (std::size_t k = 0; k < content.positions.size(); ++k) {
    const double sod = content.seconds_of_day + 30.0 * static_cast<double>(k);
    const int ms = static_cast<int>(std::lround((sod - std::floor(sod)) * 1000.0));
    std::snprintf(line, sizeof line, "%04d %03d %02d %02d %02d %03d\n", content.year, content.day_of_year,
                  static_cast<int>(sod / 3600), static_cast<int>(sod / 60) % 60, static_cast<int>(sod) % 60, ms);
    text << line;
    const auto& q = content.positions[k];
    const auto& v = content.velocities[k];
    std::snprintf(line, sizeof line, "%.4f %.4f %.4f\n%.7f %.7f %.7f\n", q.x * 1000.0, q.y * 1000.0, q.z * 1000.0, v.x, v.y,
                  v.z);
    text << line;
  }
  text.close();
  p.request.orbit_file = (p.dir / "orbit.txt").string();
  const Acquisition a = radar_extract(p.request);
  ASSERT_EQ(a.orbit.vectors.size(), 21u);
  EXPECT_EQ(a.orbit.family, sar::geometry::OrbitFamily::kTextOrbit);
  for (const auto& sv : a.orbit.vectors) {
    const auto truth = orbit.state(sv.time);
    EXPECT_NEAR(sv.position[0], truth.position.x, 0.01);
    EXPECT_NEAR(sv.position[2], truth.position.z, 0.01);
    EXPECT_NEAR(sv.velocity[1], truth.velocity.y, 1e-4);
  }
  // A missing text orbit is refused, naming it.
  p.request.orbit_file = (p.dir / "missing.txt").string();
  try {
    radar_extract(p.request);
    ADD_FAILURE() << "missing orbit accepted";
  } catch (const CeosError& e) {
    EXPECT_NE(std::string(e.what()).find("missing.txt"), std::string::npos) << e.what();
  }
}

TEST(Extract, BrokenDataSetsAreRefusedWithTheFileNamed) {
  struct Case {
    const char* name;
    std::function<void(Product&)> make;
    const char* file;  // "data" or "leader"
    const char* words;
  };
  const auto plain = [](Product& p) { sim::rsat::write_data_file(p.request.data_file, records({1, 2, 3, 4})); };
  const Case cases[] = {
      {"missing data file", [](Product&) {}, "data", "data file not found"},
      {"missing leader", [&](Product& p) { plain(p); fs::remove(p.request.leader_file); }, "leader", "leader file not found"},
      {"leader of another satellite", [&](Product& p) { plain(p); p.leader(21, "E2", "ERS-2"); }, "leader", "another satellite"},
      {"four vectors", [&](Product& p) { plain(p); p.leader(4); }, "leader", "There are less than 3 state vectors"},
      {"record longer than the descriptor allows",
       [](Product& p) { sim::rsat::write_data_file(p.request.data_file, records({1, 2, 3}), {.record_length = 300}); }, "data",
       "disagrees with the file descriptor"},
      {"record length field wrong",
       [](Product& p) {
         auto r = records({1, 2, 3});
         r[1].length_override = 100;
         sim::rsat::write_data_file(p.request.data_file, r);
       },
       "data", "disagrees with the file descriptor"},
      {"truncated data file",
       [&](Product& p) {
         plain(p);
         fs::resize_file(p.request.data_file, fs::file_size(p.request.data_file) - 20);
       },
       "data", "truncated"},
      {"more records announced than present",
       [](Product& p) { sim::rsat::write_data_file(p.request.data_file, records({1, 2, 3}), {.announced_records = 5}); }, "data",
       "truncated"},
      {"no replica",
       [](Product& p) {
         auto r = records({1, 2, 3});
         r[0].replica.clear();
         sim::rsat::write_data_file(p.request.data_file, r);
       },
       "data", "no chirp replica"},
      {"receive duration change",
       [](Product& p) {
         auto r = records({1, 2, 3});
         r[2].aux.rx_duration = 3;
         sim::rsat::write_data_file(p.request.data_file, r);
       },
       "data", "Rx Duration change"},
      {"ADC change",
       [](Product& p) {
         auto r = records({1, 2, 3});
         r[1].aux.adc_code = 1;
         sim::rsat::write_data_file(p.request.data_file, r);
       },
       "data", "ADC code change"},
      {"beam code 0",
       [](Product& p) {
         auto r = records({1, 2});
         r[0].aux.beam_code = 0;
         sim::rsat::write_data_file(p.request.data_file, r);
       },
       "data", "beam code 0"},
      {"packet length", [](Product& p) {
         auto r = records({1, 2});
         r[1].fill = 500;
         sim::rsat::write_data_file(p.request.data_file, r);
       },
       "data", "Packet length error"},
      {"gap beyond 1000 lines", [](Product& p) { sim::rsat::write_data_file(p.request.data_file, records({1, 2, 1004})); },
       "data", "gap of 1001 lines"},
      {"not a data file", [](Product& p) { std::ofstream(p.request.data_file) << "hello"; }, "data", "truncated"},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    Product p("broken");
    p.leader();
    c.make(p);
    const std::string file = std::string(c.file) == "data" ? p.request.data_file : p.request.leader_file;
    try {
      radar_extract(p.request);
      ADD_FAILURE() << "accepted";
    } catch (const CeosError& e) {
      EXPECT_EQ(std::string(e.what()).rfind(file + ": ", 0), 0u) << e.what();
      EXPECT_NE(std::string(e.what()).find(c.words), std::string::npos) << e.what();
    }
    EXPECT_TRUE(p.outputs_absent());
  }
}

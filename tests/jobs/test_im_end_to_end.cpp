// The IM job end to end on a simulated product, through the focussing executable: every point
// target of the truth file must be found in the SLC at its zero-Doppler time and slant range
// (mapped through the annotation's first line and first sample times), with the resolution the
// processed bands predict, and the corners must geolocate the SLC grid.
#include <gtest/gtest.h>

#include <array>
#include <cmath>
#include <cstdio>
#include <fstream>
#include <functional>
#include <optional>
#include <regex>

#include "analyser/irf.hpp"
#include "base/profile.hpp"
#include "geometry/geolocation.hpp"
#include "geometry/orbit_file.hpp"
#include "geometry/orbit_interp.hpp"
#include "irf_theory.hpp"
#include "job_harness.hpp"
#include "simulator/simulator.hpp"

using namespace sar::test;
namespace sim = sar::simulator;

namespace {

struct Scene {
  const char* name;
  int kernel = 1;
  std::optional<double> centroid;  // squint of the beam to this centroid at the scene centre, Hz
  std::vector<sim::Fault> faults;
  double clutterDb = -200.0;
  int lines = 4200;
  const char* azimuthOverlap = "2400";
};

// Focuses one simulated scene through the focussing executable and checks every target.
void focus_scene(const Scene& sc) {
  SCOPED_TRACE(sc.name);
  ScratchJob job(std::string("im_e2e_") + sc.name);
  sim::SimulationConfig c;
  c.out_dir = (job.dir() / "inputs").string();
  c.lines = sc.lines;
  c.samples = 1400;
  c.noise_db = sc.clutterDb > -100.0 ? 0.0 : -10.0;
  // The platform's own yaw-steering law: the centroid the orbit predicts is then the scene's.
  c.attitude.yaw_steering = true;
  c.centroid_hz = sc.centroid;
  c.faults = sc.faults;
  c.clutter.power_db = sc.clutterDb;
  c.targets = {{{45.0, 10.0, 0.0}, 30.0}, {{45.02, 10.03, 0.0}, 25.0}, {{44.985, 9.99, 0.0}, 25.0}};
  c.ins_template = kInsTemplate;
  c.xca_template = kXcaTemplate;
  const sim::SimulationTruth t = sim::run_simulation(c);
  const std::string root = (job.dir() / "out").string();
  const std::string list = job.layout({t.level0_path, t.orbit_path, t.ins_path, t.xca_path, root, "512", "512",
                                       "NotOK", "NotOK", "NotOK", "NotOK", "NotOK", "OK", "1.0"});
  set_parameters(job.dir() / "des" / "parameters_IM.hdr",
                 {{"LinesInBlock", "4096"}, {"AzimuthOverlap", sc.azimuthOverlap}, {"SamplesInBlock", "1024"},
                  {"RangeOverlap", "256"}, {"RangeWindowHammingParameter", "0"},
                  {"AzimuthWindowHammingParameter", "0"}, {"Azblk", "1000"},
                  {"PerformInterpolation", std::to_string(sc.kernel)}});
  const RunResult r = job.run("main_focussing_asar_IM#" + list);
  ASSERT_EQ(r.status, 0) << r.err << job.log();

  const std::string slc = root + "_slc";
  ASSERT_TRUE(fs::exists(slc));
  ASSERT_TRUE(fs::exists(slc + "_hdr"));
  EXPECT_TRUE(fs::exists(slc + ".tif"));
  EXPECT_FALSE(fs::exists(slc + ".part"));
  // GDAL opens the quick-look, which fits the 512 x 512 the list asked for and is tied to WGS84.
  const fs::path info = job.dir() / "gdalinfo.txt";
  std::string quickLook;
  if (std::system(("gdalinfo '" + slc + ".tif' >'" + info.string() + "' 2>&1").c_str()) == 0) {
    const std::string text = slurp(info);
    quickLook = text;
    std::smatch size;
    ASSERT_TRUE(std::regex_search(text, size, std::regex("Size is ([0-9]+), ([0-9]+)"))) << text;
    EXPECT_EQ(std::max(std::stoi(size[1]), std::stoi(size[2])), 512) << text;
    EXPECT_NE(text.find("WGS 84"), std::string::npos) << text;
    EXPECT_NE(text.find("GCP[  3]"), std::string::npos) << text;
  } else {
    ADD_FAILURE() << "gdalinfo cannot open the quick-look: " << slurp(info);
  }

  // The footprint encloses every target the SLC holds (checked below), as GDAL reads it.
  for (const char* ext : {".kml", ".shp", ".shx", ".dbf", ".prj", ".xml"}) EXPECT_TRUE(fs::exists(slc + ext)) << ext;
  double extent[4] = {0, 0, 0, 0};  // lon min, lat min, lon max, lat max
  {
    const fs::path ogr = job.dir() / "ogrinfo.txt";
    if (std::system(("ogrinfo -so -al '" + slc + ".shp' >'" + ogr.string() + "' 2>&1").c_str()) == 0) {
      const std::string text = slurp(ogr);
      std::smatch e;
      ASSERT_TRUE(std::regex_search(text, e, std::regex("Extent: \\(([-0-9.]+), ([-0-9.]+)\\) - \\(([-0-9.]+), ([-0-9.]+)\\)")))
          << text;
      for (int i = 0; i < 4; ++i) extent[i] = std::stod(e[i + 1]);
      EXPECT_NE(text.find("Feature Count: 1"), std::string::npos) << text;
    }
  }

  // The SLC grid from the job's own log line (sizes and first times).
  const std::string log = job.log();
  std::smatch m;
  ASSERT_TRUE(std::regex_search(log, m, std::regex("SLC: ([0-9]+) lines of ([0-9]+) samples, first line ([-0-9.e+]+) s, "
                                                   "first sample ([-0-9.e+]+) s")))
      << log;
  const int lines = std::stoi(m[1]), samples = std::stoi(m[2]);
  const double firstLine = std::stod(m[3]), firstSample = std::stod(m[4]);
  ASSERT_EQ(fs::file_size(slc), static_cast<std::uintmax_t>(lines) * samples * 8);
  std::vector<std::complex<float>> image(static_cast<std::size_t>(lines) * samples);
  std::ifstream(slc, std::ios::binary).read(reinterpret_cast<char*>(image.data()),
                                            static_cast<std::streamsize>(image.size() * 8));

  const double fs_ = 19207680.0;
  const Lobes theoryRg = range_theory(t.chirp_bandwidth, fs_);
  sar::analyser::ComplexImageView view{image, lines, samples, samples, 0, 0};
  sar::analyser::AnalyserOptions opt;
  const sar::geometry::OrbitData orbit = sar::geometry::read_orbit(t.orbit_path);

  // The quick-look's tie points sit where the SLC's own corners geolocate, within one quick-look
  // pixel (its size on the ground taken from the tie points themselves).
  auto ground = [&](double line, double sample) {
    sar::geometry::grpt_rec rec;
    rec.azimuth_time = firstLine + line / t.prf;
    rec.tau = firstSample + sample / fs_;
    rec.wavelength = t.wavelength;
    EXPECT_EQ(sar::geometry::geolocate(orbit, rec), 0);
    return std::array<double, 2>{rec.longitude, rec.latitude};
  };
  auto metres = [](std::array<double, 2> a, std::array<double, 2> b) {
    return std::hypot((a[1] - b[1]) * kPi / 180.0 * 6371000.0,
                      (a[0] - b[0]) * kPi / 180.0 * 6371000.0 * std::cos(a[1] * kPi / 180.0));
  };
  if (!quickLook.empty()) {
    std::smatch size;
    ASSERT_TRUE(std::regex_search(quickLook, size, std::regex("Size is ([0-9]+), ([0-9]+)")));
    const double width = std::stod(size[1]), height = std::stod(size[2]);
    const std::regex gcp("\\(([-0-9.e]+),([-0-9.e]+)\\) -> \\(([-0-9.e]+),([-0-9.e]+),");
    std::vector<std::array<double, 4>> points;  // pixel, line, lon, lat
    for (auto it = std::sregex_iterator(quickLook.begin(), quickLook.end(), gcp); it != std::sregex_iterator(); ++it)
      points.push_back({std::stod((*it)[1]), std::stod((*it)[2]), std::stod((*it)[3]), std::stod((*it)[4])});
    ASSERT_EQ(points.size(), 4u) << quickLook;
    const double across = metres({points[0][2], points[0][3]}, {points[1][2], points[1][3]}) / width;
    const double along = metres({points[0][2], points[0][3]}, {points[2][2], points[2][3]}) / height;
    for (const auto& p : points) {
      const auto truth = ground(p[1] * lines / height, p[0] * samples / width);
      EXPECT_LT(metres({p[2], p[3]}, truth), std::min(across, along))
          << "tie point (" << p[0] << ", " << p[1] << "), pixel " << across << " x " << along << " m";
    }
  }

  int measured = 0;
  for (const auto& target : t.targets) {
    const double line = (target.zero_doppler_time - firstLine) * t.prf;
    const double sample = (target.range_time - firstSample) * fs_;
    if (line < 20 || line > lines - 20 || sample < 20 || sample > samples - 20) continue;
    const auto irf = sar::analyser::measure_point(view, line, sample, opt);
    ASSERT_TRUE(irf.valid) << irf.problem;
    // The antenna pattern maps to Doppler through the satellite's speed over the Earth-fixed
    // target, not the (slower) effective speed of the Doppler rate.
    const double speed =
        sar::geometry::norm(sar::geometry::orbit_state_at(orbit, target.zero_doppler_time).velocity);
    const Lobes theoryAz = azimuth_theory(t.prf, speed, 10.0);
    std::printf("%s: line %.3f (%+.3f) sample %.3f (%+.3f) az %.3f px (theory %.3f) rg %.3f px (theory %.3f) "
                "PSLR az %.2f (%.2f) rg %.2f (%.2f) ISLR az %.2f (%.2f) rg %.2f (%.2f)\n",
                sc.name, irf.peak_line, irf.peak_line - line, irf.peak_sample, irf.peak_sample - sample, irf.res_az_px,
                theoryAz.width, irf.res_rg_px, theoryRg.width, irf.pslr_az_db, theoryAz.pslr, irf.pslr_rg_db,
                theoryRg.pslr, irf.islr_az_db, theoryAz.islr, irf.islr_rg_db, theoryRg.islr);
    EXPECT_NEAR(irf.peak_line, line, 0.1);
    EXPECT_NEAR(irf.peak_sample, sample, 0.1);
    EXPECT_NEAR(irf.res_rg_px, theoryRg.width, 0.1 * theoryRg.width);
    EXPECT_NEAR(irf.res_az_px, theoryAz.width, 0.1 * theoryAz.width);
    EXPECT_NEAR(irf.pslr_rg_db, theoryRg.pslr, 1.5);
    EXPECT_NEAR(irf.pslr_az_db, theoryAz.pslr, 1.5);
    EXPECT_NEAR(irf.islr_rg_db, theoryRg.islr, 1.5);
    EXPECT_NEAR(irf.islr_az_db, theoryAz.islr, 1.5);
    // Geolocation: the measured pixel, through the SLC's first times and the orbit, lands on the
    // target within 2 m (a pixel is about 20 m across track on the ground, 4 m along; an orbit
    // epoch off by 1 ms would move it 7 m).
    sar::geometry::grpt_rec rec;
    rec.azimuth_time = firstLine + irf.peak_line / t.prf;
    rec.tau = firstSample + irf.peak_sample / fs_;
    rec.wavelength = t.wavelength;
    rec.height = target.target.position.height;
    ASSERT_EQ(sar::geometry::geolocate(orbit, rec), 0);
    const double north = (rec.latitude - target.target.position.lat_deg) * kPi / 180.0 * 6371000.0;
    const double east = (rec.longitude - target.target.position.lon_deg) * kPi / 180.0 * 6371000.0 *
                        std::cos(target.target.position.lat_deg * kPi / 180.0);
    std::printf("%s: geolocation error north %.2f m east %.2f m\n", sc.name, north, east);
    if (extent[2] > extent[0]) {
      EXPECT_GT(target.target.position.lon_deg, extent[0]);
      EXPECT_LT(target.target.position.lon_deg, extent[2]);
      EXPECT_GT(target.target.position.lat_deg, extent[1]);
      EXPECT_LT(target.target.position.lat_deg, extent[3]);
    }
    EXPECT_LT(std::hypot(north, east), 2.0) << "north " << north << " m, east " << east << " m";
    ++measured;
  }
  EXPECT_GE(measured, 2);
}

}  // namespace

// Every kernel on the same scene, and the scenes that test the intake and the centroid: lost
// packets, a sampling window change, and a beam squinted beyond half the PRF over clutter (the
// estimator must find the centroid and its ambiguity from the data; the geometry does not
// know the squint).
TEST(ImJobEndToEnd, FocusesSimulatedTargetsWhereTheTruthPutsThem) {
  auto scene = [](const char* name, auto&& change) {
    Scene sc;
    sc.name = name;
    change(sc);
    return sc;
  };
  const auto same = [](Scene&) {};
  const Scene scenes[] = {
      scene("yaw_law_kernel1", same),
      scene("yaw_law_kernel0", [](Scene& sc) { sc.kernel = 0; }),
      scene("yaw_law_kernel3", [](Scene& sc) { sc.kernel = 3; }),
      scene("lost_packets", [](Scene& sc) { sc.faults = {sim::Fault::kLostPackets}; }),
      scene("swst_change", [](Scene& sc) { sc.faults = {sim::Fault::kSwstChange}; }),
      scene("squint_1200Hz",
            [](Scene& sc) {
              sc.centroid = -1200.0;
              sc.clutterDb = 25.0;
              sc.lines = 6000;
              sc.azimuthOverlap = "3200";
            }),
  };
  for (const Scene& sc : scenes) focus_scene(sc);
}

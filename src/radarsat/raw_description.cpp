// The description of an extracted RADARSAT-1 data set: the raw set in "<raw>.hdr", the replica's
// raster header in "<chirp>.hdr".
#include <chrono>
#include <cmath>
#include <filesystem>

#include "base/convert.hpp"
#include "base/diagnostics.hpp"
#include "geometry/orbit_interp.hpp"
#include "io/general_sar.hpp"
#include "io/vrt_sidecar.hpp"
#include "radarsat/extract.hpp"

namespace sar::radarsat {
namespace {

constexpr double kAntennaLength = 15.0;  // m, along track

std::string time_text(double sec85) {
  std::string text;
  return base::sec852myascii(sec85, text) == 0 ? text : std::string("unknown");
}

double now_sec85() {
  const double unix = std::chrono::duration<double>(std::chrono::system_clock::now().time_since_epoch()).count();
  return unix - 473385600.0;  // 1985-01-01 in Unix seconds
}

// The state vectors on a regular grid: the leader's as they are; a text orbit's records, which
// may be spaced unevenly, interpolated at their mean spacing over their span.
void put_state_vectors(const geometry::OrbitData& orbit, metadata::SAROrbitStateVectors_Obj& sv) {
  const auto& v = orbit.vectors;
  const std::size_t n = v.size();
  const double interval = n > 1 ? (v.back().time - v.front().time) / static_cast<double>(n - 1) : 0.0;
  bool regular = true;
  for (std::size_t k = 0; k < n; ++k)
    if (std::fabs(v[k].time - (v.front().time + static_cast<double>(k) * interval)) > 1e-6) regular = false;
  sv.SVCreate(v.front().time, interval, static_cast<int>(n));
  for (std::size_t k = 0; k < n; ++k) {
    const geometry::StateVector s =
        regular ? v[k] : geometry::orbit_state_at(orbit, v.front().time + static_cast<double>(k) * interval);
    for (std::size_t i = 0; i < 3; ++i) {
      sv.pos[3 * k + i] = s.position[i];
      sv.vel[3 * k + i] = s.velocity[i];
    }
  }
}

void remove_quietly(const std::string& path) {
  const base::ErrnoGuard keep;
  std::error_code ec;
  std::filesystem::remove(path, ec);
}

}  // namespace

void write_raw_description(const Acquisition& a, const ExtractRequest& rq) {
  io::GeneralRAWData raw;
  raw.dataFile.lines = static_cast<int32_t>(a.lines);
  raw.dataFile.pixels = a.samples;
  raw.dataFile.rowPrefix = sizeof(float);  // the near range time before every line
  raw.dataFile.headerOffset = 0;
  raw.dataFile.cellType = io::kFloatComplex;
  raw.roi.SetSlowAxe(a.first_line_time, 1.0 / a.prf, static_cast<int>(a.lines));
  raw.roi.SetFastAxe(a.near_range_time, 1.0 / a.sampling_rate, a.samples);

  auto& sc = raw.sampling;
  sc.fc_hz = a.carrier_frequency;
  sc.frg_hz = a.sampling_rate;
  sc.Brg_hz = a.pulse_bandwidth;
  sc.Trg_s = 1.0 / a.sampling_rate;
  sc.prf_hz = a.prf;
  sc.pri_s = 1.0 / a.prf;
  sc.Baz_hz = a.prf;
  sc.brf_hz = 0.0;  // no bursts
  sc.bri_s = 0.0;
  sc.lambda_m = a.wavelength;

  put_state_vectors(a.orbit, raw.stateVectors);

  auto& p = raw.pulse;
  p.PulseLength = a.pulse_length;
  p.Bandwidth = a.pulse_bandwidth;
  p.PulseKRate = a.pulse_bandwidth / a.pulse_length;
  p.PulseEnergy = 1.0;
  p.PulseSamplingRate = a.sampling_rate;

  auto& info = raw.info;
  const auto& dss = a.leader.dss;
  info.OrbitNumber = dss.orbit_number.empty() ? "0" : dss.orbit_number;
  info.Track = std::string(1, '0');  // (a literal assignment trips a false -Wrestrict of GCC 12)
  info.SenseDate = time_text(a.first_line_time);
  info.SceneID = dss.scene_id.empty() ? "unknown" : dss.scene_id;
  info.Description = "StripMap RAW Data File";
  info.AcquisitionStation = "unknown";
  info.fillOMBRIX();
  info.ProcessingDate = time_text(now_sec85());
  info.ProcessingSoftware = "RADARExtract";
  info.OrbitConfiguration = dss.orbit_configuration;
  info.Polarization = "H/H";
  info.Swath = a.beam;
  // The receive window's extent over the lines: the nearest and the farthest line start, s.
  info.SWST_MIN = a.near_range_time;
  info.SWST_MAX = a.far_range_time;
  info.RangeBandwidth[0] = a.pulse_bandwidth;
  info.SensorName = "RADARSAT-1";
  info.AcquisitionMode = "STRIPMAP";
  info.ImageType = "RAW";
  info.MissingLines = static_cast<int32_t>(a.missing_lines);

  raw.attitude.AntennaLength = kAntennaLength;

  auto& sw = raw.swath;
  sw.Rank = a.pulses_in_flight;
  sw.Acquisition_Start_Time = a.first_line_time;
  int changes = 0;
  for (std::size_t l = 1; l < a.swst.size(); ++l)
    if (a.swst[l] != a.swst[l - 1]) ++changes;
  sw.Swst_changes = changes;

  io::DataFile chirp(rq.chirp_path);
  chirp.lines = 1;
  chirp.pixels = a.replica_samples;
  chirp.cellType = io::kFloatComplex;
  if (raw.writehdr(rq.raw_path) != 0 || chirp.write_hdr() != 0) {
    for (const std::string& raster : {rq.raw_path, rq.chirp_path}) {
      remove_quietly(io::header_of(raster));
      remove_quietly(io::vrt_sidecar_path(raster));
    }
    ceos_fail(io::header_of(rq.raw_path), -1, "the extracted data set's description cannot be written");
  }
}

}  // namespace sar::radarsat

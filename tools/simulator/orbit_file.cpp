#include "simulator/orbit_file.hpp"

#include <cmath>
#include <fstream>
#include <stdexcept>

#include "simulator/header_text.hpp"

namespace sar::simulator {

namespace {

double proc_time_of(const OrbitFileRequest& r) { return r.proc_time > 0.0 ? r.proc_time : r.stop + 29.0 * 86400.0; }

}  // namespace

std::string orbit_product_name(const OrbitFileRequest& request) {
  return "DOR_VOR_AXVF-P" + compact_time(proc_time_of(request)) + "_" + compact_time(request.start) + "_" +
         compact_time(request.stop);
}

std::string orbit_record(const StateVector& s, int absolute_orbit) {
  std::string r = time_text(s.time);
  r += ' ' + signed_fraction(0.0, 6);
  r += ' ' + signed_int(absolute_orbit, 5);
  for (double v : {s.position.x, s.position.y, s.position.z}) r += ' ' + signed_fixed(v, 12, 3);
  for (double v : {s.velocity.x, s.velocity.y, s.velocity.z}) r += ' ' + signed_fixed(v, 12, 6);
  r += "      3\n";  // quality flag of a precise orbit
  if (r.size() != kOrbitRecordBytes) throw std::logic_error("orbit record is not 129 bytes");
  return r;
}

std::string write_orbit_file(const OrbitModel& orbit, const OrbitFileRequest& request, const std::string& folder) {
  if (!(request.step > 0.0) || request.stop < request.start) throw std::runtime_error("bad orbit file span");
  const long long count = static_cast<long long>(std::floor((request.stop - request.start) / request.step + 1e-9)) + 1;
  const double last = request.start + static_cast<double>(count - 1) * request.step;
  OrbitFileRequest named = request;
  named.stop = last;
  const std::string name = orbit_product_name(named);
  const long long data_offset = static_cast<long long>(kMphBytes + kOrbitSphBytes);
  const long long data_size = count * static_cast<long long>(kOrbitRecordBytes);

  MphFields m;
  m.product = name;
  m.proc_stage = 'V';
  m.acquisition_station = "ORBITE MISSION";
  m.proc_center = "O_M";
  m.proc_time = proc_time_of(named);
  m.software_ver = "sarsim/1.0";
  m.sensing_start = request.start;
  m.sensing_stop = last;
  m.phase = 'X';
  m.cycle = 0;
  m.tot_size = data_offset + data_size;
  m.sph_size = static_cast<long long>(kOrbitSphBytes);
  m.num_dsd = 1;
  m.num_data_sets = 1;

  HeaderText sph;
  sph.quoted("SPH_DESCRIPTOR", "ORBITE POE_REST SAT ENV1", 28);
  sph.spare(52);
  sph.raw(build_dsd({"DORIS PRECISE ORBIT", 'M', "NOT USED", data_offset, data_size, count,
                     static_cast<long long>(kOrbitRecordBytes)}));
  if (sph.size() != kOrbitSphBytes) throw std::logic_error("orbit SPH is not 378 bytes");

  const std::string path = folder + "/" + name;
  std::ofstream out(path, std::ios::binary | std::ios::trunc);
  if (!out) throw std::runtime_error("cannot write " + path);
  out << build_mph(m) << sph.str();
  for (long long k = 0; k < count; ++k) {
    const double t = request.start + static_cast<double>(k) * request.step;
    out << orbit_record(orbit.state(t), orbit.absolute_orbit(t));
  }
  out.close();
  if (!out) throw std::runtime_error("cannot write " + path);
  return path;
}

}  // namespace sar::simulator

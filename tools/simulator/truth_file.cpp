#include "simulator/truth_file.hpp"

#include <algorithm>
#include <cstdio>
#include <fstream>
#include <stdexcept>

#include "simulator/header_text.hpp"

namespace sar::simulator {

namespace {

class TruthWriter {
 public:
  explicit TruthWriter(const std::string& path) : out_(path, std::ios::trunc) {
    if (!out_) throw std::runtime_error("cannot write " + path);
  }
  void section(const std::string& name) { out_ << "\n[" << name << "]\n"; }
  void text(const char* key, const std::string& value) { out_ << key << " = " << value << '\n'; }
  void integer(const char* key, long long value) { out_ << key << " = " << value << '\n'; }
  void number(const char* key, double value, const char* format = "%.12g") {
    char buffer[64];
    std::snprintf(buffer, sizeof buffer, format, value);
    text(key, buffer);
  }
  void time(const char* key, double sec85) {
    text(key, time_text(sec85));
    number((std::string(key) + "_sec85").c_str(), sec85, "%.9f");
  }
  template <class Range>
  void list(const char* key, const Range& values) {
    std::string s = "{";
    for (const auto& v : values) {
      if (s.size() > 1) s += ' ';
      s += v;
    }
    text(key, s + "}");
  }
  void raw(const std::string& line) { out_ << line << '\n'; }
  void close() {
    out_.close();
    if (!out_) throw std::runtime_error("cannot write the truth file");
  }

 private:
  std::ofstream out_;
};

}  // namespace

void write_truth_file(const SimulationTruth& t, const SimulationConfig& c, const OrbitModel& orbit,
                      const std::string& path) {
  TruthWriter w(path);
  const bool im = t.mode == AcquisitionMode::kIM;
  const bool ws = t.mode == AcquisitionMode::kWS;
  const ChannelTruth& ref = t.channels.at(static_cast<std::size_t>(t.reference_channel));
  if (im) w.raw("Truth of a simulated ENVISAT ASAR image mode level 0 product, written by sarsim.");
  else if (ws) w.raw("Truth of a simulated ENVISAT ASAR wide swath level 0 product, written by sarsim.");
  else w.raw("Truth of a simulated ENVISAT ASAR alternating polarisation level 0 product, written by sarsim.");
  w.raw("Times in UTC; sec85 is seconds since 1-JAN-1985. Ranges in metres, times in seconds.");

  w.section("product");
  w.text("level0_file", t.level0_path);
  w.text("orbit_file", t.orbit_path);
  w.text("product_name", t.product_name);
  w.text("orbit_name", t.orbit_name);
  w.text("ins_file", t.ins_path);
  w.text("xca_file", t.xca_path);
  w.text("mode", mode_codes(t.mode).letters);
  w.text("swath", ws ? std::string("WS") : "IS" + std::to_string(c.im.beam_code));
  w.text("polarization", t.channels.front().polarization);
  w.integer("full_size", t.full_size);

  w.section("acquisition");
  w.time("first_line_time", t.first_line_time);
  w.integer("line_count", t.line_count);
  w.integer("echo_lines", t.echo_lines);
  std::vector<std::string> cal;
  for (int l : t.calibration_lines) cal.push_back(std::to_string(l));
  w.list("calibration_lines", cal);
  w.integer("first_counter", t.first_counter);
  w.integer("last_counter", t.last_counter);
  w.number("prf", t.prf, "%.9f");
  w.integer("pri_code", ref.pri_code);
  w.integer("swst_code", t.swst_code);
  w.integer("swl_code", c.samples);
  w.integer("line_samples", c.samples);
  w.number("sampling_frequency", c.im.sampling_frequency, "%.3f");
  w.number("carrier_frequency", c.im.carrier_frequency, "%.3f");
  w.number("wavelength", t.wavelength, "%.12f");
  w.integer("pulse_code", c.im.pulse_code);
  w.number("pulse_length", t.pulse_length, "%.12e");
  w.integer("bandwidth_code", c.im.bandwidth_code);
  w.number("chirp_bandwidth", t.chirp_bandwidth, "%.6f");
  w.number("range_gate_bias", c.im.range_gate_bias, "%.12e");
  w.integer("swath_rank", t.swath_rank);
  w.integer("beam_code", ref.beam_code);
  w.number("near_range_time", t.near_range_time, "%.15e");
  w.number("antenna_length", c.im.antenna_length, "%.3f");
  w.number("noise_db", c.noise_db, "%.3f");
  w.number("doppler_centroid", t.doppler_centroid, "%.3f");
  w.integer("yaw_steering", t.attitude.yaw_steering ? 1 : 0);
  w.number("squint", t.attitude.squint_rad, "%.9e");
  w.number("range_resolution", kSpeedOfLight / (2.0 * t.chirp_bandwidth), "%.6f");
  w.number("azimuth_resolution", c.im.antenna_length / 2.0, "%.6f");
  w.text("echo_convention", "up-chirp from the two-way delay 2R/c over pulse_length, stop and go at the packet time");
  if (!im) {
    w.time("first_packet_time", t.first_packet_time);
    w.integer("channels", static_cast<long long>(t.channels.size()));
    w.integer("reference_channel", t.reference_channel);
    if (ws) {
      w.integer("cycle_packets", t.cycle_packets);
      w.integer("first_cycle_counter", t.first_cycle_counter);
      w.integer("whole_cycles", t.whole_cycles);
      std::vector<std::string> order;
      for (int s : c.ws.order) order.push_back(std::to_string(s + 1));
      w.list("firing_order", order);
    } else {
      w.integer("grid_lines", t.grid_lines);
      w.integer("channel_lines", t.channel_lines);
    }
    for (std::size_t k = 0; k < t.channels.size(); ++k) {
      const ChannelTruth& ch = t.channels[k];
      w.section("channel_" + std::to_string(k + 1));
      w.text("polarization", ch.polarization);
      w.integer("beam_code", ch.beam_code);
      w.integer("pri_code", ch.pri_code);
      w.number("prf", ch.prf, "%.9f");
      w.integer("swath_rank", ch.swath_rank);
      w.integer("swst_code", ch.swst_code);
      w.number("near_range_time", ch.near_range_time, "%.15e");
      w.integer("swl_code", ch.samples);
      w.integer(ws ? "burst_echoes" : "block_echoes", ch.burst_echoes);
      w.number("target_gain", ch.target_gain, "%.6f");
      w.integer("echo_packets", ch.echo_packets);
      w.integer("noise_packets", ch.noise_packets);
      w.integer("calibration_packets", ch.calibration_packets);
      if (ws) {
        // Bursts of the whole cycles: the stamp of each first echo, sec85.
        const long long first_cycle = (t.first_cycle_counter - kWsInitialPackets) / std::max(1, t.cycle_packets);
        std::vector<std::string> bursts;
        for (const PacketTruth& p : t.packets) {
          if (!p.burst_start || p.channel != static_cast<int>(k) || p.cycle < first_cycle ||
              p.cycle >= first_cycle + t.whole_cycles)
            continue;
          char text[32];
          std::snprintf(text, sizeof text, "%.6f", p.time);
          bursts.push_back(text);
        }
        w.list("burst_times_sec85", bursts);
      }
    }
  }

  w.section("orbit");
  const OrbitElements& e = orbit.elements();
  w.time("epoch", e.epoch);
  w.number("semi_major_axis", e.semi_major_axis, "%.3f");
  w.number("inclination", e.inclination_deg, "%.6f");
  w.number("period", orbit.period(), "%.6f");
  w.integer("ascending", c.ascending ? 1 : 0);
  w.integer("absolute_orbit", orbit.absolute_orbit(t.first_line_time));
  w.time("ascending_node_time", orbit.ascending_node_before(t.first_line_time));

  for (std::size_t i = 0; i < t.targets.size(); ++i) {
    const TargetTruth& tt = t.targets[i];
    w.section("target_" + std::to_string(i + 1));
    w.number("latitude", tt.target.position.lat_deg, "%.9f");
    w.number("longitude", tt.target.position.lon_deg, "%.9f");
    w.number("height", tt.target.position.height, "%.3f");
    w.number("amplitude", tt.target.amplitude, "%.6f");
    w.number("x", tt.ecef.x, "%.4f");
    w.number("y", tt.ecef.y, "%.4f");
    w.number("z", tt.ecef.z, "%.4f");
    w.time("zero_doppler_time", tt.zero_doppler_time);
    w.number("slant_range", tt.slant_range, "%.4f");
    w.number("range_time", tt.range_time, "%.15e");
    w.number("azimuth_line", tt.azimuth_line, "%.6f");
    w.number("range_sample", tt.range_sample, "%.6f");
    w.number("doppler_rate", tt.doppler_rate, "%.6f");
    w.number("doppler_centroid", tt.doppler_centroid, "%.3f");
    w.time("beam_centre_time", tt.beam_centre_time);
    w.number("incidence", tt.incidence_deg, "%.6f");
    w.number("look", tt.look_deg, "%.6f");
  }

  w.section("faults");
  std::vector<std::string> names;
  for (Fault f : c.faults) names.emplace_back(std::string("\"") + fault_name(f) + "\"");
  w.list("faults", names);
  std::vector<std::string> lost;
  for (int l : t.lost_lines) lost.push_back(std::to_string(l));
  w.list("lost_lines", lost);
  w.integer("corrupt_header_line", t.corrupt_header_line);
  w.integer("wrong_mode_line", t.wrong_mode_line);
  w.integer("sequence_wrap_line", t.sequence_wrap_line);
  w.integer("swst_change_line", t.swst_change_line);
  w.integer("swst_code_after_change", t.swst_change_line >= 0 ? t.swst_code_after_change : -1);
  w.integer("truncated_at_byte", t.truncated_at_byte);
  w.integer("last_whole_line", t.last_whole_line);

  if (t.clutter.present) {
    w.section("clutter");
    w.number("power_db", c.clutter.power_db, "%.3f");
    w.text("contrast", clutter_contrast_name(c.clutter.contrast));
    w.number("doppler_centroid_near", t.clutter.centroid_near, "%.6f");
    w.number("doppler_centroid_mid", t.clutter.centroid_mid, "%.6f");
    w.number("doppler_centroid_far", t.clutter.centroid_far, "%.6f");
    w.integer("ambiguity_mid", t.clutter.ambiguity_mid);
  }
  w.close();
}

}  // namespace sar::simulator

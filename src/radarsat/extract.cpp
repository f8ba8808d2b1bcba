#include "radarsat/extract.hpp"

#include <algorithm>
#include <array>
#include <cmath>
#include <complex>
#include <cstdio>
#include <filesystem>
#include <limits>
#include <memory>

#include "base/diagnostics.hpp"

namespace sar::radarsat {
namespace {

constexpr int64_t kDescriptorLineCount = 180;
constexpr int64_t kDescriptorRecordLength = 186;
constexpr int64_t kDescriptorMinBytes = 192;

struct FileCloser {
  void operator()(std::FILE* f) const {
    if (f) std::fclose(f);
  }
};
using FilePtr = std::unique_ptr<std::FILE, FileCloser>;

int64_t ascii_int(const std::array<char, 6>& field, const std::string& name, int64_t at) {
  int64_t v = 0;
  bool digits = false;
  for (char c : field) {
    if (c == ' ' && !digits) continue;
    if (c < '0' || c > '9') ceos_fail(name, at, "bad integer in the file descriptor");
    v = v * 10 + (c - '0');
    digits = true;
  }
  if (!digits) ceos_fail(name, at, "empty integer in the file descriptor");
  return v;
}

/// An output written under "<path>.part" and renamed into place only by commit(); dropped
/// otherwise, so a failed extraction leaves no file that looks finished.
class PartFile {
 public:
  explicit PartFile(std::string path) : path_(std::move(path)), part_(path_ + ".part") {
    file_.reset(std::fopen(part_.c_str(), "wb"));
    if (!file_) ceos_fail(path_, -1, "output file cannot be created");
    std::setvbuf(file_.get(), nullptr, _IOFBF, 1 << 22);
  }
  PartFile(const PartFile&) = delete;
  PartFile& operator=(const PartFile&) = delete;
  ~PartFile() {
    if (!committed_) {
      file_.reset();
      std::error_code ec;
      std::filesystem::remove(part_, ec);
    }
  }
  void write(const void* data, std::size_t bytes) {
    if (std::fwrite(data, 1, bytes, file_.get()) != bytes) ceos_fail(path_, -1, "write failed (disk full?)");
  }
  void commit() {
    if (std::fclose(file_.release()) != 0) ceos_fail(path_, -1, "close failed (disk full?)");
    std::error_code ec;
    std::filesystem::rename(part_, path_, ec);
    if (ec) ceos_fail(path_, -1, "cannot rename " + part_);
    committed_ = true;
  }

 private:
  std::string path_, part_;
  FilePtr file_;
  bool committed_ = false;
};

void read_exact(std::FILE* f, void* buffer, std::size_t bytes, const std::string& name, int64_t at, const char* what) {
  if (std::fread(buffer, 1, bytes, f) != bytes) ceos_fail(name, at, std::string(what) + " read failed (truncated?)");
}

/// Day offset (-1, 0, +1) that puts a time of day inside the orbit's span, or nearest to it.
double line_day_start(double dayStart, double timeOfDay, const geometry::OrbitData& orbit) {
  double best = dayStart;
  double bestDistance = std::numeric_limits<double>::infinity();
  for (int d : {0, -1, 1}) {
    const double t = dayStart + d * 86400.0 + timeOfDay;
    const double distance = std::max({0.0, orbit.sensing_start - t, t - orbit.sensing_stop});
    if (distance < bestDistance) {
      bestDistance = distance;
      best = dayStart + d * 86400.0;
    }
  }
  return best;
}

std::string at_line(const char* text, int64_t record) { return std::string(text) + " at record " + std::to_string(record + 1); }

}  // namespace

DataFileDescriptor read_data_descriptor(const std::string& name) {
  std::error_code ec;
  const std::uintmax_t size = std::filesystem::file_size(name, ec);
  if (ec) ceos_fail(name, -1, "data file not found");
  FilePtr f(std::fopen(name.c_str(), "rb"));
  if (!f) ceos_fail(name, -1, "data file cannot be opened");
  std::array<uint8_t, kDescriptorMinBytes> head{};
  if (size < kDescriptorMinBytes) ceos_fail(name, 0, "data file shorter than its file descriptor (truncated?)");
  read_exact(f.get(), head.data(), head.size(), name, 0, "file descriptor");
  DataFileDescriptor d;
  d.length = (int64_t{head[8]} << 24) | (int64_t{head[9]} << 16) | (int64_t{head[10]} << 8) | int64_t{head[11]};
  if (d.length < kDescriptorMinBytes || static_cast<uintmax_t>(d.length) > size)
    ceos_fail(name, 8, "file descriptor length " + std::to_string(d.length) + " does not fit the file");
  std::array<char, 6> field{};
  std::copy_n(reinterpret_cast<const char*>(head.data()) + kDescriptorLineCount, 6, field.begin());
  d.records = ascii_int(field, name, kDescriptorLineCount);
  std::copy_n(reinterpret_cast<const char*>(head.data()) + kDescriptorRecordLength, 6, field.begin());
  d.record_length = ascii_int(field, name, kDescriptorRecordLength);
  if (d.record_length <= static_cast<int64_t>(kLinePrefixBytes))
    ceos_fail(name, kDescriptorRecordLength, "record length " + std::to_string(d.record_length) + " too short for a signal record");
  if (d.records <= 0) ceos_fail(name, kDescriptorLineCount, "file descriptor announces no signal records");
  return d;
}

Acquisition radar_extract(const ExtractRequest& rq) {
  Acquisition acq;
  acq.leader = read_leader(rq.leader_file);
  if (rq.orbit_file.empty()) {
    acq.orbit = leader_orbit(acq.leader);
  } else {
    try {
      acq.orbit = geometry::read_orbit(rq.orbit_file);
    } catch (const geometry::OrbitError& e) {
      throw CeosError(rq.orbit_file, e.offset(), e.what());
    }
  }
  const double dayStart = acq.leader.ppr.day_start();

  const std::string& name = rq.data_file;
  const DataFileDescriptor fdr = read_data_descriptor(name);
  if (rq.lines_to_skip < 0 || rq.lines_to_extract < 0 || rq.lines_to_skip + rq.lines_to_extract > fdr.records)
    ceos_fail(name, -1, "lines to skip and extract exceed the " + std::to_string(fdr.records) + " records of the file");
  const int64_t skip = rq.lines_to_skip;
  const int64_t extract = rq.lines_to_extract > 0 ? rq.lines_to_extract : std::numeric_limits<int64_t>::max();

  FilePtr in(std::fopen(name.c_str(), "rb"));
  if (!in) ceos_fail(name, -1, "data file cannot be opened");
  std::setvbuf(in.get(), nullptr, _IOFBF, 1 << 22);
  if (std::fseek(in.get(), static_cast<long>(fdr.length), SEEK_SET) != 0) ceos_fail(name, fdr.length, "seek failed");

  PartFile raw(rq.raw_path);
  std::vector<uint8_t> record(static_cast<std::size_t>(fdr.record_length));
  std::vector<std::complex<float>> line;
  std::vector<std::complex<double>> replicaSum;
  std::vector<std::complex<float>> zeros;
  float lastTime = 0.0f;
  bool anyWritten = false;
  int64_t out = 0;            // output line counter, zero lines included, skipped ones too
  int64_t written = 0;
  int64_t expectedIndex = -1; // line index the next record should carry
  int64_t nextRecord = fdr.length;
  int echoBytes = 0;
  AdcRate adc{};
  AuxHeader first{};
  acq.near_range_time = 1.0e10;
  acq.far_range_time = -1.0e10;
  int lastPercent = -1;

  auto write_line = [&](float t, const std::complex<float>* samples, int32_t swst, int32_t sequence, int32_t mark) {
    raw.write(&t, sizeof t);
    raw.write(samples, sizeof(std::complex<float>) * static_cast<std::size_t>(acq.samples));
    acq.swst.push_back(swst);
    acq.sequence.push_back(sequence);
    acq.missing.push_back(mark);
    ++written;
  };

  for (int64_t r = 0; r < fdr.records && written < extract; ++r) {
    // Records differ in length (a replica makes one longer); each is walked by its own length.
    const int64_t at = nextRecord;
    if (std::fread(record.data(), 1, kLinePrefixBytes, in.get()) != kLinePrefixBytes)
      ceos_fail(name, at,
                "data file truncated: it ends inside record " + std::to_string(r + 1) + " of the " +
                    std::to_string(fdr.records) + " the file descriptor announces");
    const SignalHeader sh = decode_signal_header(std::span<const uint8_t, kSignalHeaderBytes>(record.data(), kSignalHeaderBytes));
    const AuxHeader aux = decode_aux_header(
        std::span<const uint8_t, kAuxHeaderBytes>(record.data() + kSignalHeaderBytes, kAuxHeaderBytes));
    if (sh.record_length > fdr.record_length || sh.record_length < static_cast<int64_t>(kLinePrefixBytes))
      ceos_fail(name, at + 8,
                "record length " + std::to_string(sh.record_length) + " disagrees with the file descriptor's " +
                    std::to_string(fdr.record_length) + at_line("", r));
    if (sh.record_length - 2 * sh.sample_count > kMaxRecordOverhead ||
        2 * sh.sample_count + static_cast<int64_t>(kLinePrefixBytes) > sh.record_length)
      ceos_fail(name, at + 24, at_line("Packet length error", r));
    const std::size_t rest = static_cast<std::size_t>(sh.record_length) - kLinePrefixBytes;
    if (std::fread(record.data() + kLinePrefixBytes, 1, rest, in.get()) != rest)
      ceos_fail(name, at,
                "data file truncated: it ends inside record " + std::to_string(r + 1) + " of the " +
                    std::to_string(fdr.records) + " the file descriptor announces");
    nextRecord += sh.record_length;

    if (r == 0) {
      const auto rate = adc_rate(aux.adc_code);
      const auto band = pulse_bandwidth(aux.bandwidth_code);
      const auto beam = beam_of(aux.beam_code);
      if (!rate) ceos_fail(name, at + 214, "unknown ADC rate code " + std::to_string(aux.adc_code));
      if (!band) ceos_fail(name, at + 204, "unknown pulse bandwidth code " + std::to_string(aux.bandwidth_code));
      if (!beam) ceos_fail(name, at + 210, "beam code " + std::to_string(aux.beam_code) + " outside 1 to 20");
      adc = *rate;
      first = aux;
      acq.adc_code = aux.adc_code;
      acq.sampling_period = adc.sampling_period;
      acq.sampling_rate = 1.0 / adc.sampling_period;
      acq.pulse_bandwidth = *band;
      acq.beam = std::string(beam->name);
      acq.beam_code = aux.beam_code;
      acq.pulses_in_flight = beam->pulses_in_flight;
      acq.prf = prf_of(aux.pri_count, adc.time_unit);
      acq.samples = echo_samples(aux.rx_duration);
      acq.replica_samples = adc.replica_bytes / 2;
      echoBytes = 2 * acq.samples;
      line.resize(static_cast<std::size_t>(acq.samples));
      zeros.assign(static_cast<std::size_t>(acq.samples), {0.0f, 0.0f});
      replicaSum.assign(static_cast<std::size_t>(acq.replica_samples), {0.0, 0.0});
      expectedIndex = sh.line_index;
      if (static_cast<int64_t>(kLinePrefixBytes) + echoBytes > sh.record_length)
        ceos_fail(name, at + 222, "receive duration needs more bytes than a record holds");
    } else {
      if (static_cast<int64_t>(kLinePrefixBytes) + echoBytes > sh.record_length)
        ceos_fail(name, at + 24, at_line("record too short for its echo", r));
      if (aux.rx_duration != first.rx_duration) ceos_fail(name, at + 221, at_line("Rx Duration change", r));
      if (aux.adc_code != first.adc_code) ceos_fail(name, at + 214, at_line("ADC code change", r));
    }

    // Line index: repeated or backward records are dropped; gaps become zero lines.
    if (sh.line_index < expectedIndex) {
      ++acq.dropped_records;
      base::report(base::kReportWarning, name + ": line index " + std::to_string(sh.line_index) + " repeated or backward " +
                                             at_line("", r) + ", record dropped");
      continue;
    }
    const int64_t gap = sh.line_index - expectedIndex;
    if (gap > kMaxLineGap)
      ceos_fail(name, at + 12,
                "gap of " + std::to_string(gap) + " lines in the line index" + at_line("", r) + ", more than " +
                    std::to_string(kMaxLineGap));

    // Replica ahead of the echo when the record holds more than the echo.
    std::size_t echoAt = kLinePrefixBytes;
    if (2 * sh.sample_count - echoBytes > kMaxRecordOverhead) {
      if (static_cast<int64_t>(kLinePrefixBytes) + adc.replica_bytes + echoBytes > sh.record_length)
        ceos_fail(name, at, at_line("Replica read error", r));
      const uint8_t* p = record.data() + kLinePrefixBytes;
      for (int k = 0; k < acq.replica_samples; ++k)
        replicaSum[static_cast<std::size_t>(k)] += std::complex<double>(decode_nibble(p[2 * k]), decode_nibble(p[2 * k + 1]));
      ++acq.replicas;
      echoAt += static_cast<std::size_t>(adc.replica_bytes);
    }

    for (int64_t k = 0; k < gap; ++k, ++out) {
      ++acq.missing_lines;
      if (out >= skip && anyWritten && written < extract) write_line(lastTime, zeros.data(), aux.swst_count, 0, 1);
    }
    expectedIndex = sh.line_index + 1;
    if (written >= extract) break;

    const double t = near_range_time(aux.swst_count, adc.time_unit, acq.pulses_in_flight, acq.prf);
    if (out >= skip) {
      if (!anyWritten) {
        acq.reference_attenuation = aux.attenuation;
        const double tod = aux.time_of_day();
        acq.first_line_time = line_day_start(dayStart, tod, acq.orbit) + tod - (out - skip) / acq.prf;
        // Zero lines written ahead of the first record's time: none, as anyWritten was false.
        base::report(base::kReportCheckpoint, "First Azimuth time read");
      }
      const float g = attenuation_gain(acq.reference_attenuation, aux.attenuation);
      const uint8_t* e = record.data() + echoAt;
      for (int k = 0; k < acq.samples; ++k)
        line[static_cast<std::size_t>(k)] = {decode_nibble(e[2 * k]) / g, decode_nibble(e[2 * k + 1]) / g};
      acq.near_range_time = std::min(acq.near_range_time, t);
      acq.far_range_time = std::max(acq.far_range_time, t);
      lastTime = static_cast<float>(t);
      write_line(lastTime, line.data(), aux.swst_count, static_cast<int32_t>(sh.line_index), 0);
      anyWritten = true;
    }
    ++out;

    if (rq.progress) {
      const int percent = static_cast<int>(100 * (r + 1) / fdr.records);
      if (percent != lastPercent) rq.progress(lastPercent = percent);
    }
  }
  if (written == 0) ceos_fail(name, -1, "no line extracted");
  if (acq.replicas == 0) ceos_fail(name, -1, "no chirp replica in the extracted lines");
  acq.lines = written;

  PartFile chirp(rq.chirp_path);
  std::vector<std::complex<float>> replica(replicaSum.size());
  for (std::size_t k = 0; k < replica.size(); ++k)
    replica[k] = std::complex<float>(replicaSum[k] / static_cast<double>(acq.replicas));
  chirp.write(replica.data(), replica.size() * sizeof replica[0]);
  write_raw_description(acq, rq);
  raw.commit();
  chirp.commit();
  base::report(base::kReportCheckpoint, "Extraction Ended");
  return acq;
}

}  // namespace sar::radarsat

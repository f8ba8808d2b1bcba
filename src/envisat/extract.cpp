// Level 0 extraction: the packet walk.
#include "envisat/extract.hpp"

#include <algorithm>
#include <array>
#include <cmath>
#include <cstdio>
#include <filesystem>
#include <memory>
#include <string_view>

#include "base/diagnostics.hpp"
#include "base/errors.hpp"
#include "base/run_services.hpp"
#include "envisat/detail/block_io.hpp"

namespace sar::envisat {

namespace {

namespace ec = sar::base::ec;
using sar::base::fatal;
using sar::base::input_fault;
using sar::base::InputFault;
using sar::base::report;
using sar::base::kReportCheckpoint;
using sar::base::kReportError;
using sar::base::kReportWarning;

constexpr std::int64_t kSyncBlock = 600000;        // bytes scanned for a clean head
constexpr std::int64_t kResyncStepBack = 66;       // restart two bytes after a bad head
constexpr int kLookAheadPackets = 10;
constexpr int kMaxCounterLead = 100;               // a counter further ahead is noise in the stream
constexpr int kSwstLeapLimit = 100;
constexpr int kSwstMinStart = 5000;
constexpr int kMaxSamples = 65536;                 // a 16-bit window length bounds a line
constexpr double kAntennaLength = 10.0;
// Polarisation contradictions reported one by one; beyond one echo in kMismatchShare the
// extraction ends.
constexpr std::int64_t kReportedMismatches = 10;
constexpr std::int64_t kMismatchShare = 100;
constexpr std::array<const char*, 4> kPolarisationText = {"H/H", "V/V", "H/V", "V/H"};

std::string at_text(std::int64_t pos, std::int64_t size) {
  char t[96];
  std::snprintf(t, sizeof t, "byte %lld of %lld", static_cast<long long>(pos), static_cast<long long>(size));
  return t;
}

double round_half_away(double x) { return x >= 0.0 ? std::floor(x + 0.5) : std::ceil(x - 0.5); }

using detail::OutputFile;
using detail::ProductReader;

struct ChannelState {
  std::vector<float> line;   // last decoded echo, 2 x samples floats at least
  std::vector<float> noise;
  std::vector<float> zeros;
  int currentSwst = 0;
  bool swstSeen = false;
  int minSwst = kSwstMinStart;
  int maxSwst = 0;
  int calLines = 0;
  int calWidth = 0;
  int noisePackets = 0;
  double noisePower = 0.0;
  OutputFile out;
  io::LineStore* store = nullptr;  // set: echo lines go here instead of `out`
  std::array<OutputFile, 4> cal;
};

class Walker {
 public:
  Walker(const std::string& path, const Level0Header& header, LineTable& table, const FbaqTables& fbaq,
         std::span<const float> gains, std::span<sarpar> channels, extconf& conf)
      : in_(path, header.fileSize), header_(header), mode_(header.mode), table_(table), fbaq_(fbaq), decoder_(fbaq),
        gains_(gains), pairGains_(2 * gains.size()), par_(channels), conf_(conf), state_(channels.size()) {
    // Each gain twice, beside the I and the Q it divides, so a line divides as one run of floats.
    for (std::size_t k = 0; k < gains.size(); ++k) pairGains_[2 * k] = pairGains_[2 * k + 1] = gains[k];
  }

  void run(const WalkRange& range, const ProgressSink& progress);
  void finish();

 private:
  // Heads.
  void read_head();  // reads a head at the current position, resynchronising while it is lost
  void synchromdsr();
  void skip_payload() { in_.seek(in_.pos() + std::max<std::int64_t>(head_.payload_bytes(), 0)); }
  std::span<const std::uint8_t> read_payload();
  std::int64_t checkmissing();
  void fill_buffers();

  // Packets.
  void echo(std::int64_t i, int channel, int expected);
  void calibration(int channel);
  void noise(int channel);
  void fill_gap(std::int64_t i);
  // Alternating polarisation: the echo's polarisation bits against the channel of the table.
  void check_polarisation(int channel, int expected);

  // Lines.
  float range_time(int channel, int swst) const {
    const sarpar& p = par_[static_cast<std::size_t>(channel)];
    return static_cast<float>(swst / p.samplingRate + p.swath_rank / p.prf - par_[0].range_gate_bias);
  }
  void write_line(int channel, std::span<const float> samples) {
    ChannelState& s = state_[static_cast<std::size_t>(channel)];
    const float t = range_time(channel, s.currentSwst);
    const std::size_t bytes = static_cast<std::size_t>(2 * par_[static_cast<std::size_t>(channel)].samples) * sizeof(float);
    if (s.store) {
      s.store->append(&t, sizeof t);
      s.store->append(samples.data(), bytes);
      return;
    }
    s.out.write(&t, sizeof t);
    s.out.write(samples.data(), bytes);
  }
  void side(int channel, int swst, int replaced, int counter) {
    const auto c = static_cast<std::size_t>(channel);
    conf_.line_swst[c].push_back(swst);
    conf_.line_replaced[c].push_back(replaced);
    conf_.line_counter[c].push_back(counter);
  }
  void decode_echo(int channel, std::span<const std::uint8_t> payload);
  int other(int channel) const { return 1 - channel; }

  ProductReader in_;
  const Level0Header& header_;
  int mode_;
  LineTable& table_;
  const FbaqTables& fbaq_;
  FbaqEchoDecoder decoder_;
  std::span<const float> gains_;
  std::vector<float> pairGains_;
  std::span<sarpar> par_;
  extconf& conf_;
  std::vector<ChannelState> state_;

  std::array<std::uint8_t, l0::kHeadSize> headBytes_{};
  PacketHead head_;
  bool reportHeads_ = true;  // header messages on; off while scanning for synchronisation
  double firstTime_ = 0.0;
  double fillTime_ = 0.0;
  int burstCounter_ = 0;
  int outLines_ = 0;
  std::int64_t apEchoes_ = 0;
  std::int64_t polarisationMismatches_ = 0;
  std::string firstMismatch_;
  friend int sar::envisat::extract_level0(const std::string&, const Level0Header&, LineTable&,
                                          const FbaqTables&, std::span<const float>, std::span<sarpar>, extconf&,
                                          const ProgressSink&);
};

void Walker::synchromdsr() {
  const std::int64_t start = in_.pos();
  std::vector<std::uint8_t> block(static_cast<std::size_t>(std::min(kSyncBlock, in_.size() - start)));
  const std::int64_t got = in_.read_some(block);
  reportHeads_ = false;
  for (std::int64_t off = 0; off + static_cast<std::int64_t>(l0::kHeadSize) <= got; ++off) {
    const HeadBytes h(block.data() + off, l0::kHeadSize);
    if (check_packet_header(h, mode_) == 0 && (int{h[l0::kPacketLength]} << 8 | h[l0::kPacketLength + 1]) >= l0::kFieldHeaderBytes) {
      in_.seek(start + off);
      reportHeads_ = true;
      return;
    }
  }
  reportHeads_ = true;
  // A full block without a clean head leaves the file 68 bytes before its end, so the search
  // goes on from there; a block cut by the end of the product means no packet is left.
  if (got < kSyncBlock)
    input_fault(InputFault::kMalformed, ec::kFileIo, {in_.path(), "no clean packet header before the end of the level 0 product", at_text(start, in_.size())});
  in_.seek(start + got - static_cast<std::int64_t>(l0::kHeadSize));
}

void Walker::read_head() {
  for (;;) {
    in_.read(headBytes_, "a packet header");
    std::string message;
    int score = check_packet_header(headBytes_, mode_, &message);
    head_ = decode_packet_head(headBytes_);
    // A packet length below the data field header leaves no payload: the head is not one.
    if (head_.packetLength < l0::kFieldHeaderBytes) score += l0::kScoreLost;
    if (score < l0::kScoreLost) {
      if (score > 0 && reportHeads_) report(kReportWarning, message);
      return;
    }
    if (reportHeads_ && !message.empty()) report(kReportWarning, message);
    reportHeads_ = true;
    in_.seek(in_.pos() - kResyncStepBack);
    synchromdsr();
  }
}

// A view into the reader's block: valid until the product is read again.
std::span<const std::uint8_t> Walker::read_payload() { return in_.view(head_.payload_bytes(), "a packet payload"); }

void Walker::decode_echo(int channel, std::span<const std::uint8_t> payload) {
  ChannelState& s = state_[static_cast<std::size_t>(channel)];
  const int samples = par_[static_cast<std::size_t>(channel)].samples;
  if (!packet_fits_echo(samples, static_cast<std::int64_t>(payload.size()))) return;  // the previous line stands
  const std::int64_t lineBytes = echo_line_layout(samples).lineBytes;
  const auto lines = static_cast<std::size_t>(static_cast<std::int64_t>(payload.size()) / lineBytes);
  const std::size_t need = 2 * static_cast<std::size_t>(samples) * std::max<std::size_t>(lines, 1);
  if (s.line.size() < need) s.line.resize(need);
  int floats = 0, count = 0;
  decoder_.decode_divided(payload, s.line, samples, pairGains_, floats, count);
}

std::int64_t Walker::checkmissing() {
  // Looks over the next packets' counters; nothing is decided on them, so the walk goes on
  // where it stood. The end of the product ends the look quietly.
  const std::int64_t here = in_.pos();
  const PacketHead keep = head_;
  const auto keepBytes = headBytes_;
  for (int n = 0; n < kLookAheadPackets; ++n) {
    const std::int64_t next = in_.pos() + head_.payload_bytes();
    if (next + static_cast<std::int64_t>(l0::kHeadSize) > in_.size()) break;
    in_.seek(next);
    std::array<std::uint8_t, l0::kHeadSize> h{};
    in_.read(h, "a packet header");
    if (check_packet_header(h, mode_) >= l0::kScoreLost) break;
    head_ = decode_packet_head(h);
    if (head_.packetLength < l0::kFieldHeaderBytes) break;
  }
  head_ = keep;
  headBytes_ = keepBytes;
  in_.seek(here);
  return here;
}

void Walker::fill_buffers() {
  const std::int64_t here = in_.pos();
  in_.seek(here - static_cast<std::int64_t>(l0::kHeadSize));
  const PacketHead keep = head_;
  const auto keepBytes = headBytes_;
  for (std::size_t ch = 0; ch < state_.size(); ++ch) {
    for (;;) {
      read_head();
      // Each channel is primed with an echo of its own: its beam in wide swath, its
      // polarisation pair in alternating polarisation.
      bool wanted = head_.echo;
      if (is_burst_mode(mode_)) wanted = wanted && head_.beamCode - mode_info(mode_).beamOffset == static_cast<int>(ch);
      if (is_alternating(mode_)) wanted = wanted && ap_channel(mode_, head_.txV, head_.rxV) == static_cast<int>(ch);
      if (!wanted) {
        skip_payload();
        continue;
      }
      state_[ch].currentSwst = head_.swstCode;
      if (fillTime_ == 0.0) fillTime_ = head_.time;
      decode_echo(static_cast<int>(ch), read_payload());
      break;
    }
  }
  head_ = keep;
  headBytes_ = keepBytes;
  in_.seek(here);
}

void Walker::echo(std::int64_t i, int channel, int expected) {
  const LineTableEntry& e = table_.entries[static_cast<std::size_t>(i)];
  if (!head_.echo) report(kReportWarning, "Type flag is incorrect! Expected Echo!");
  const int tableChannel = is_alternating(mode_) || is_burst_mode(mode_) ? e.channel_word : 0;
  if (channel != tableChannel) {
    char t[128];
    std::snprintf(t, sizeof t, "Mdsr swath is not equal to packet swath. Mdsr is %d - Table is %d", channel, tableChannel);
    report(kReportWarning, t);
    channel = tableChannel;
  }
  if (is_alternating(mode_)) check_polarisation(channel, expected);
  decode_echo(channel, read_payload());
  if ((e.kind_word & kLineBurstStart) && channel == 0) ++burstCounter_;

  sarpar& p = par_[static_cast<std::size_t>(channel)];
  ChannelState& s = state_[static_cast<std::size_t>(channel)];
  const int swst = head_.swstCode;
  if (!s.swstSeen) {
    s.swstSeen = true;
    s.currentSwst = swst;
    p.swst_change_count = 0;
    // The start value only stands for "no window met yet": a channel whose windows all open
    // later than it (a wide swath sub-swath late in its PRI) has its first window as the smallest.
    if (s.minSwst >= kSwstMinStart) s.minSwst = swst;
  } else if (swst != s.currentSwst) {
    if (mode_ == kModeWS && p.swst_change_count >= 0 && p.swst_change_count < kMaxSwstChanges)
      p.swst_change_burst[static_cast<std::size_t>(p.swst_change_count)] = burstCounter_;
    ++p.swst_change_count;
    const int leap = swst - s.currentSwst;
    if (std::abs(leap) > kSwstLeapLimit) {
      char t[128];
      std::snprintf(t, sizeof t, "WST out of range! - Swath SS%d - %d samples leap. ", channel + 1, leap);
      report(kReportWarning, t);
    } else {
      s.currentSwst = swst;
    }
  }
  s.minSwst = std::min(s.minSwst, s.currentSwst);
  s.maxSwst = std::max(s.maxSwst, s.currentSwst);
  if (firstTime_ == 0.0) firstTime_ = head_.time;

  if (conf_.extract_kind == kExtractEchoes) {
    write_line(channel, s.line);
    if (is_alternating(mode_)) {
      const int o = other(channel);
      ChannelState& so = state_[static_cast<std::size_t>(o)];
      // The other polarisation was not received on this line: a stand-in, not an echo.
      write_line(o, so.zeros);
      side(o, so.currentSwst, 1, 0);
    }
    if (!is_burst_mode(mode_)) side(channel, s.currentSwst, 0, expected);
    ++outLines_;
  }
}

void Walker::check_polarisation(int channel, int expected) {
  ++apEchoes_;
  const int byBits = ap_channel(mode_, head_.txV, head_.rxV);
  if (byBits == channel) return;
  static constexpr std::array<const char*, 2> kLetter = {"H", "V"};
  char t[200];
  std::snprintf(t, sizeof t, "packet counter %d at byte %lld carries %s/%s, the timeline expects channel %d (%s)",
                expected, static_cast<long long>(in_.pos() - static_cast<std::int64_t>(l0::kHeadSize)),
                kLetter[head_.txV], kLetter[head_.rxV], channel,
                kPolarisationText[static_cast<std::size_t>(ap_polarisations(mode_)[static_cast<std::size_t>(channel)])]);
  if (polarisationMismatches_ == 0) firstMismatch_ = t;
  if (polarisationMismatches_ < kReportedMismatches)
    report(kReportWarning, std::string("Polarisation of the packet does not match the timeline: ") + t);
  ++polarisationMismatches_;
}

void Walker::calibration(int channel) {
  if (!head_.calibration) report(kReportWarning, "Type flag is incorrect! Expected Periodic calibration!");
  const auto payload = read_payload();
  const int swl = head_.swlCode;
  ChannelState& s = state_[static_cast<std::size_t>(channel)];
  if (conf_.extract_kind == kExtractCalibration) {
    const std::int64_t blockBytes = 2 * std::int64_t{swl};
    if (s.calWidth == 0) s.calWidth = swl;
    if (swl != s.calWidth || 4 * blockBytes > static_cast<std::int64_t>(payload.size())) return;
    std::vector<float> line(static_cast<std::size_t>(blockBytes));
    for (std::size_t b = 0; b < 4; ++b) {
      for (std::int64_t k = 0; k < blockBytes; ++k)
        line[static_cast<std::size_t>(k)] = static_cast<float>(payload[static_cast<std::size_t>(b * blockBytes + k)] - 127.5);
      const std::int32_t row = head_.calibrationRow;
      s.cal[b].write(&head_.time, sizeof head_.time);
      s.cal[b].write(&row, sizeof row);
      s.cal[b].write(line.data(), line.size() * sizeof(float));
    }
    ++s.calLines;
    return;
  }
  if (is_burst_mode(mode_)) return;  // a calibration pulse in wide swath lies outside the burst's echoes
  // The stand-in keeps the echo line grid; a noise file holds noise lines only.
  if (conf_.extract_kind != kExtractEchoes) return;
  write_line(channel, s.line);
  side(channel, s.currentSwst, 1, 0);
  if (is_alternating(mode_)) {
    const int o = other(channel);
    ChannelState& so = state_[static_cast<std::size_t>(o)];
    write_line(o, so.zeros);
    side(o, so.currentSwst, 1, 0);
  }
  ++outLines_;
}

void Walker::noise(int channel) {
  if (!head_.noise) report(kReportWarning, "Type flag is incorrect! Expected Noise!");
  const auto payload = read_payload();
  ChannelState& s = state_[static_cast<std::size_t>(channel)];
  const int samples = par_[static_cast<std::size_t>(channel)].samples;
  const int swl = head_.swlCode;
  if (packet_fits_noise(swl, static_cast<std::int64_t>(payload.size()))) {
    const std::size_t need = 2 * static_cast<std::size_t>(std::max(swl, samples));
    if (s.noise.size() < need) s.noise.resize(need, 0.0f);
    int floats = 0, count = 0;
    fbaq_decode84fe(payload, s.noise, swl, 1, floats, count, reportHeads_);
  }
  double power = 0.0;
  for (int k = 0; k < samples; ++k) {
    const double re = s.noise[static_cast<std::size_t>(2 * k)], im = s.noise[static_cast<std::size_t>(2 * k + 1)];
    power += (re * re + im * im) / samples;
  }
  s.noisePower += power;
  if (conf_.extract_kind == kExtractNoise) {
    const float t = range_time(channel, s.currentSwst);
    s.out.write(&t, sizeof t);
    s.out.write(s.noise.data(), static_cast<std::size_t>(2 * samples) * sizeof(float));
  }
  ++s.noisePackets;
}

void Walker::fill_gap(std::int64_t i) {
  checkmissing();
  LineTableEntry& e = table_.entries[static_cast<std::size_t>(i)];
  if (e.kind() == conf_.extract_kind) {
    const int channel = is_alternating(mode_) || is_burst_mode(mode_) ? std::clamp<int>(e.channel_word, 0, static_cast<int>(state_.size()) - 1) : 0;
    ChannelState& s = state_[static_cast<std::size_t>(channel)];
    s.minSwst = std::min(s.minSwst, s.currentSwst);
    s.maxSwst = std::max(s.maxSwst, s.currentSwst);
    if (firstTime_ == 0.0) firstTime_ = fillTime_;
    if (conf_.extract_kind == kExtractEchoes) {
      write_line(channel, s.line);
      if (is_alternating(mode_)) {
        const int o = other(channel);
        ChannelState& so = state_[static_cast<std::size_t>(o)];
        write_line(o, so.zeros);
        side(o, so.currentSwst, 1, 0);
      }
      if (!is_burst_mode(mode_)) side(channel, s.currentSwst, 1, 0);
      ++outLines_;
    }
  }
  e.kind_word = static_cast<std::uint16_t>(e.kind_word + kLineLost);
}

void Walker::run(const WalkRange& range, const ProgressSink& progress) {
  const std::int64_t first = range.first, last = range.last;
  burstCounter_ = range.startUnits;
  in_.seek(l0::kFirstMdsr);
  read_head();
  int lastPercent = -1;
  const int channels = static_cast<int>(state_.size());
  for (std::int64_t i = first; i < last; ++i) {
    const int percent = static_cast<int>(std::floor(100.0 * static_cast<double>(i - first) / static_cast<double>(last - first + 1)));
    if (percent > lastPercent) {
      lastPercent = percent;
      if (progress) progress(percent);
    }
    LineTableEntry& e = table_.entries[static_cast<std::size_t>(i)];
    const int expected = table_.first_packet_counter + static_cast<int>(i);

    if (e.channel_word >= kPaddingChannel && is_alternating(mode_)) {
      e.channel_word = static_cast<std::int16_t>(e.channel_word - kPaddingChannel);
      if (conf_.extract_kind == kExtractEchoes) {
        for (int ch = 0; ch < 2; ++ch) {
          ChannelState& s = state_[static_cast<std::size_t>(ch)];
          write_line(ch, s.zeros);
          side(ch, s.currentSwst, 1, 0);
        }
        ++outLines_;
      }
    }

    while (head_.modeCounter < expected || head_.modeCounter > expected + kMaxCounterLead) {
      skip_payload();
      read_head();
    }
    if (i == first) fill_buffers();
    if (head_.modeCounter > expected) {
      fill_gap(i);
      continue;
    }

    int channel = 0;
    if (is_burst_mode(mode_)) channel = head_.beamCode - mode_info(mode_).beamOffset;
    else if (is_alternating(mode_)) channel = e.channel_word;
    channel = std::clamp(channel, 0, channels - 1);

    switch (e.kind()) {
      case 0: echo(i, channel, expected); break;
      case 1: calibration(channel); break;
      case 2:
        if (is_burst_mode(mode_)) noise(channel);
        else skip_payload();
        break;
      default: skip_payload(); break;
    }
    if (i + 1 < last) read_head();
  }
}

void Walker::finish() {
  if (polarisationMismatches_ * kMismatchShare > apEchoes_) {
    // The channels cannot be told apart by the timeline if the packets disagree with it this
    // often: the product is not the sub-mode it was taken for.
    char count[96];
    std::snprintf(count, sizeof count, "%lld of %lld echoes", static_cast<long long>(polarisationMismatches_),
                  static_cast<long long>(apEchoes_));
    // The record is short: the product's kind and the first packet; the path and the count go
    // to the log.
    report(kReportError, in_.path() + ": packet polarisation contradicts the timeline in " + count);
    input_fault(InputFault::kContradicts, ec::kBadArguments,
                {"ASA_AP0", "packet polarisation contradicts the timeline", firstMismatch_}, -1, "polarisation",
                in_.path());
  }
  const std::size_t n = state_.size();
  int minSwst = kSwstMinStart, maxSwst = 0;
  for (const ChannelState& s : state_) {
    minSwst = std::min(minSwst, s.minSwst);
    maxSwst = std::max(maxSwst, s.maxSwst);
  }
  double cycle = 0.0;
  for (std::size_t c = 0; c < n; ++c) cycle += (par_[c].swath_rank + par_[c].burst_echoes) / par_[c].prf;
  for (std::size_t c = 0; c < n; ++c) {
    sarpar& p = par_[c];
    ChannelState& s = state_[c];
    const int lo = is_alternating(mode_) ? minSwst : s.minSwst;
    const int hi = is_alternating(mode_) ? maxSwst : s.maxSwst;
    if (mode_ == kModeIM && header_.swathDigit >= 0) p.swath_number = header_.swathDigit;
    if (is_burst_mode(mode_)) p.swath_number = static_cast<int>(c) + 1;
    p.azimuthStartTime = firstTime_;
    p.range_gate_bias = par_[0].range_gate_bias;
    p.nearRangeTime = lo / p.samplingRate + p.swath_rank / p.prf - p.range_gate_bias;
    p.far_range_time = hi / p.samplingRate + p.swath_rank / p.prf - p.range_gate_bias;
    p.lines = outLines_;
    p.scene_centre_latitude = header_.sceneCentreLatitude;
    p.antenna_length = kAntennaLength;
    p.swst_code = lo;
    p.swst_max_code = hi;
    p.noise_packets = s.noisePackets;
    p.mean_noise_power = s.noisePackets ? s.noisePower / s.noisePackets : s.noisePower;
    if (is_burst_mode(mode_)) p.cycle_time = cycle;
    s.out.commit();
    for (OutputFile& f : s.cal) f.commit();
  }
}

}  // namespace

int walk_range(extconf& conf, const LineTable& table, WalkRange& range) {
  if (conf.skip_percent < 0) conf.skip_percent = 0;
  if (conf.skip_percent > 100) {
    report(kReportError, "Wrong SkipLines parameter!");
    return 1;
  }
  if (conf.extract_percent <= 0 || conf.skip_percent + conf.extract_percent > 100)
    conf.extract_percent = 100 - conf.skip_percent;
  const double hundredth = static_cast<double>(0.01f);  // the share is taken in single precision
  range.startUnits = static_cast<std::int32_t>(round_half_away(conf.skip_percent * static_cast<double>(table.cycle_count) * hundredth));
  range.extractUnits =
      static_cast<std::int32_t>(round_half_away(conf.extract_percent * static_cast<double>(table.cycle_count) * hundredth));
  const std::int64_t n = static_cast<std::int64_t>(table.entries.size());
  std::int64_t first = std::int64_t{table.lines_per_cycle} * range.startUnits - table.first_packet_counter +
                       table.first_echo_counter;
  std::int64_t last = first + std::int64_t{table.lines_per_cycle} * range.extractUnits;
  // The timeline may promise more than the table holds: the walk stays inside the table.
  range.first = std::clamp<std::int64_t>(first, 0, n);
  range.last = std::clamp<std::int64_t>(last, range.first, n);
  return 0;
}

int extract_level0(const std::string& level0Path, const Level0Header& header, LineTable& table,
                   const FbaqTables& fbaq, std::span<const float> gains, std::span<sarpar> channels, extconf& conf,
                   const ProgressSink& progress) {
  sar::base::Frame frame("envi_extract");
  if (channels.size() != static_cast<std::size_t>(header.channels))
    fatal(ec::kBadArguments, {level0Path, "channel records do not match the mode"});
  for (const sarpar& p : channels) {
    if (p.samples < 1 || p.samples > kMaxSamples || static_cast<std::size_t>(p.samples) > gains.size() ||
        !(p.samplingRate > 0.0) || !(p.prf > 0.0))
      fatal(ec::kBadArguments, {level0Path, "acquisition parameters out of range (samples, sampling rate, PRF)"});
  }
  conf.acquisition_mode = header.mode;
  WalkRange range;
  if (walk_range(conf, table, range) != 0) return 1;
  for (sarpar& p : channels) p.burst_count = range.extractUnits;
  for (std::int64_t i = range.first; i < range.last; ++i) {
    LineTableEntry& e = table.entries[static_cast<std::size_t>(i)];
    if (e.kind() == conf.extract_kind) e.kind_word = static_cast<std::uint16_t>(e.kind_word + kLineSelected);
  }
  if (header.mode == kModeIM || is_burst_mode(header.mode))
    for (sarpar& p : channels)
      if (header.polarizationType >= 0) p.polarization_type = header.polarizationType;

  Walker w(level0Path, header, table, fbaq, gains, channels, conf);
  for (std::size_t c = 0; c < channels.size(); ++c) {
    ChannelState& s = w.state_[c];
    const sarpar& p = channels[c];
    s.line.assign(2 * static_cast<std::size_t>(p.samples), 0.0f);
    s.noise.assign(2 * static_cast<std::size_t>(p.samples), 0.0f);
    s.zeros.assign(2 * static_cast<std::size_t>(p.samples), 0.0f);
    if (conf.extract_kind == kExtractNoise) {
      s.out = OutputFile(p.noise_file);
    } else if (conf.extract_kind == kExtractEchoes && conf.lines_in_memory && c < conf.line_stores.size()) {
      conf.line_stores[c] = std::make_shared<io::LineStore>(4 + 8 * static_cast<std::size_t>(p.samples));
      s.store = conf.line_stores[c].get();
    } else {
      const std::string path = !p.raw_file.empty() ? p.raw_file : p.extrPath;
      if (path.empty() || (p.raw_file.empty() && channels.size() > 1))
        fatal(ec::kBadArguments, {level0Path, "no line file path for a channel"});
      s.out = OutputFile(path);
    }
    if (conf.extract_kind == kExtractCalibration) {
      static constexpr std::array<const char*, 4> kNames = {"CAL1SS%d", "CAL1ASS%d", "CAL2SS%d", "CAL3SS%d"};
      const std::string dir = p.outputDir.empty() ? std::string(".") : p.outputDir;
      for (std::size_t k = 0; k < 4; ++k) {
        char name[32];
        std::snprintf(name, sizeof name, kNames[k], static_cast<int>(c) + 1);
        s.cal[k] = OutputFile(dir + "/" + name);
      }
    }
    channels[c].mean_noise_power = 0.0;
  }
  for (std::size_t c = 0; c < 2; ++c) {
    conf.line_swst[c].clear();
    conf.line_replaced[c].clear();
    conf.line_counter[c].clear();
  }
  if (range.last > range.first) w.run(range, progress);
  w.finish();
  report(kReportCheckpoint, "Extraction Ended");
  return 0;
}

int envi_extract(const std::string& level0Path, const std::string& insPath, const std::string& xchPath,
                 std::vector<sarpar>& channels, extconf& conf, const TableBuilder& buildTable) {
  (void)xchPath;  // the calibration rows are read by the calibration stage itself
  sar::base::Frame frame("envi_extract");
  const Level0Header header = read_level0_header(level0Path);
  FbaqTables fbaq;
  if (int st = frame.check(LUTfbaq_f(insPath, fbaq.q, fbaq.i))) return st;
  std::vector<float> gains(kGainTableLength);
  if (int st = frame.check(read_gain_table(insPath, gains))) return st;
  if (channels.size() < static_cast<std::size_t>(header.channels)) channels.resize(static_cast<std::size_t>(header.channels));
  if (!buildTable) fatal(ec::kBadArguments, {level0Path, "no timeline table builder for the mode"});
  LineTable table;
  const std::span<sarpar> used(channels.data(), static_cast<std::size_t>(header.channels));
  if (int st = frame.check(buildTable(level0Path, insPath, header.mode, table, used))) return st;
  sar::base::waitbar_open("EXTRACTING LEVEL 0");
  const int st = extract_level0(level0Path, header, table, fbaq, gains, used, conf,
                                [](int percent) { sar::base::waitbar_update(percent); });
  return frame.check(st);
}

}  // namespace sar::envisat

// Parameters of the first packets and the timeline tables of level 0 products.
#include "envisat/table_builder.hpp"

#include <algorithm>
#include <array>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <optional>
#include <stdexcept>
#include <vector>

#include "base/diagnostics.hpp"
#include "base/errors.hpp"
#include "envisat/aux_products.hpp"
#include "envisat/level0_format.hpp"

namespace sar::envisat {
namespace {

namespace ec = sar::base::ec;
using sar::base::fatal;
using sar::base::input_fault;
using sar::base::InputFault;

std::string at_byte(std::int64_t pos) {
  char t[64];
  std::snprintf(t, sizeof t, "byte %lld", static_cast<long long>(pos));
  return t;
}

// Random access to the bytes of a product, every read checked against its size.
class Level0Bytes {
 public:
  explicit Level0Bytes(std::string path) : path_(std::move(path)) {
    std::error_code err;
    const auto size = std::filesystem::file_size(path_, err);
    in_.open(path_, std::ios::binary);
    if (err || !in_) input_fault(InputFault::kMissing, ec::kImageMissing, {path_, "level 0 product cannot be opened"});
    size_ = static_cast<std::int64_t>(size);
  }
  std::int64_t size() const { return size_; }
  const std::string& path() const { return path_; }

  /// Reads up to `out.size()` bytes at `pos`; returns the count.
  std::int64_t read_at(std::int64_t pos, std::span<std::uint8_t> out) {
    if (pos < 0 || pos >= size_) return 0;
    const std::int64_t n = std::min<std::int64_t>(static_cast<std::int64_t>(out.size()), size_ - pos);
    in_.clear();
    in_.seekg(pos);
    in_.read(reinterpret_cast<char*>(out.data()), n);
    if (in_.gcount() != n) input_fault(InputFault::kTruncated, ec::kFileIo, {path_, "read failed", at_byte(pos)});
    return n;
  }

 private:
  std::string path_;
  std::ifstream in_;
  std::int64_t size_ = 0;
};

using Head = std::array<std::uint8_t, l0::kHeadSize>;

// A head that the builders accept: a clean score and room for the data field header.
bool clean_head(HeadBytes h, int mode) {
  const int length = (int{h[l0::kPacketLength]} << 8) | h[l0::kPacketLength + 1];
  return length >= l0::kFieldHeaderBytes && check_packet_header(h, mode) == 0;
}

// Position of the first clean head at or after `from`, searched block by block to the end.
std::optional<std::int64_t> next_clean_head(Level0Bytes& file, std::int64_t from, int mode) {
  std::vector<std::uint8_t> block(static_cast<std::size_t>(kHeadSearchBlock));
  for (std::int64_t start = from; start + static_cast<std::int64_t>(l0::kHeadSize) <= file.size();) {
    const std::int64_t got = file.read_at(start, block);
    const std::int64_t lastOffset = got - static_cast<std::int64_t>(l0::kHeadSize);
    for (std::int64_t off = 0; off <= lastOffset; ++off)
      if (clean_head(HeadBytes(block.data() + off, l0::kHeadSize), mode)) return start + off;
    if (start + got >= file.size()) break;
    start += lastOffset + 1;  // the next block starts where no whole head could be tried
  }
  return std::nullopt;
}

PacketMark mark_of(const PacketHead& h) { return {h.modeCounter, h.time, h.echo}; }

void check_mode(int mode) {
  if (mode < kModeIM || mode > kModeGM) throw std::invalid_argument("acquisition mode out of range");
}

Timeline timeline_of(int mode) {
  if (is_burst_mode(mode)) return Timeline::kWs;
  return is_alternating(mode) ? Timeline::kAp : Timeline::kIm;
}

// The seven statistics of one channel, one slot per head looked at; 0 is an empty slot.
struct ChannelStatistic {
  enum Field { kSwl, kPulse, kBandwidth, kPri, kBeam, kSwst, kNoiseSwl, kFields };
  std::array<std::vector<std::int32_t>, kFields> values;
  int firstSeen = 0;
  ChannelStatistic() {
    for (auto& v : values) v.assign(static_cast<std::size_t>(kStatisticPackets), 0);
  }
  std::int32_t most_frequent(Field f) const { return most_frequent_value(values[f]); }
};

}  // namespace

PacketMark first_packet(const std::string& level0Path, int mode) {
  check_mode(mode);
  Level0Bytes file(level0Path);
  const auto at = next_clean_head(file, l0::kFirstMdsr, mode);
  if (!at) input_fault(InputFault::kMalformed, ec::kFileIo, {level0Path, "no clean packet header in the level 0 product"});
  Head h{};
  file.read_at(*at, h);
  return mark_of(decode_packet_head(h));
}

PacketMark last_packet(const std::string& level0Path, int mode) {
  check_mode(mode);
  Level0Bytes file(level0Path);
  const std::int64_t start = std::max<std::int64_t>(l0::kFirstMdsr, file.size() - kHeadSearchBlock);
  std::vector<std::uint8_t> block(static_cast<std::size_t>(std::max<std::int64_t>(0, file.size() - start)));
  const std::int64_t got = file.read_at(start, block);
  const bool anyKind = is_burst_mode(mode);
  // d counts the bytes after the candidate head: its payload must fit in them.
  for (std::int64_t d = 0; d + static_cast<std::int64_t>(l0::kHeadSize) <= got; ++d) {
    const HeadBytes h(block.data() + (got - static_cast<std::int64_t>(l0::kHeadSize) - d), l0::kHeadSize);
    if (!clean_head(h, mode)) continue;
    const PacketHead p = decode_packet_head(h);
    if (d >= p.payload_bytes() && (anyKind || p.echo)) return mark_of(p);
  }
  input_fault(InputFault::kMalformed, ec::kFileIo, {level0Path, "no whole packet in the level 0 product",
                      "file of " + std::to_string(file.size()) + " bytes"});
}

int loadparam(const std::string& level0Path, const std::string& insPath, int mode, std::span<sarpar> channels) {
  sar::base::Frame frame("loadparam");
  check_mode(mode);
  const int count = mode_info(mode).channels;
  if (channels.size() < static_cast<std::size_t>(count))
    fatal(ec::kBadArguments, {level0Path, "channel records do not match the mode"});
  if (is_alternating(mode)) {
    const auto pols = ap_polarisations(mode);
    channels[0].polarization_type = pols[0];
    channels[1].polarization_type = pols[1];
  }

  Level0Bytes file(level0Path);
  std::vector<ChannelStatistic> stats(static_cast<std::size_t>(count));
  const int beamOffset = mode_info(mode).beamOffset;
  auto burst_channel = [&](int beam) { return beam - beamOffset >= 0 && beam - beamOffset < count ? beam - beamOffset : -1; };

  std::int64_t pos = l0::kFirstMdsr;
  int channel = 0;
  for (int k = 0; k < kStatisticPackets; ++k) {
    Head bytes{};
    if (file.read_at(pos, bytes) < static_cast<std::int64_t>(l0::kHeadSize)) break;  // a short product
    if (!clean_head(bytes, mode)) {
      // The slot stays empty; the search restarts two bytes into the bad head.
      const auto next = next_clean_head(file, pos + 2, mode);
      if (!next) break;
      pos = *next;
      continue;
    }
    const PacketHead h = decode_packet_head(bytes);
    pos += static_cast<std::int64_t>(l0::kHeadSize) + h.payload_bytes();
    const auto slot = static_cast<std::size_t>(k);
    if (!h.echo) {
      if (h.noise && mode == kModeWS) {
        const int c = burst_channel(h.beamCode);
        if (c >= 0) stats[static_cast<std::size_t>(c)].values[ChannelStatistic::kNoiseSwl][slot] = h.swlCode;
      }
      continue;
    }
    if (is_burst_mode(mode)) {
      channel = burst_channel(h.beamCode);
      if (channel < 0) continue;
    } else if (is_alternating(mode)) {
      const int c = ap_channel(mode, h.txV, h.rxV);
      if (c >= 0) channel = c;  // another pair keeps the channel of the packet before
    } else {
      channel = 0;
    }
    ChannelStatistic& s = stats[static_cast<std::size_t>(channel)];
    s.values[ChannelStatistic::kSwl][slot] = h.swlCode;
    s.values[ChannelStatistic::kPulse][slot] = h.pulseLengthCode;
    s.values[ChannelStatistic::kBandwidth][slot] = h.chirpBandwidthCode;
    s.values[ChannelStatistic::kPri][slot] = h.priCode;
    s.values[ChannelStatistic::kBeam][slot] = h.beamCode;
    s.values[ChannelStatistic::kSwst][slot] = h.swstCode;
    if (s.firstSeen == 0) s.firstSeen = k;
  }

  // Firing order of the wide swath sub-swaths: by first sight, rotated so that swath 0 leads.
  std::vector<int> order(static_cast<std::size_t>(count));
  for (int i = 0; i < count; ++i) order[static_cast<std::size_t>(i)] = i;
  if (is_burst_mode(mode)) {
    std::stable_sort(order.begin(), order.end(), [&](int a, int b) {
      return stats[static_cast<std::size_t>(a)].firstSeen < stats[static_cast<std::size_t>(b)].firstSeen;
    });
    std::rotate(order.begin(), std::find(order.begin(), order.end(), 0), order.end());
  }

  std::vector<int> beams(static_cast<std::size_t>(count));
  const int lowBeam = is_burst_mode(mode) ? 15 : 1;
  const int highBeam = is_burst_mode(mode) ? 19 : 7;
  for (int c = 0; c < count; ++c) {
    const ChannelStatistic& s = stats[static_cast<std::size_t>(c)];
    const int beam = s.most_frequent(ChannelStatistic::kBeam);
    // Alternating polarisation reads ASA_INS with channel 0's beam only.
    if ((c == 0 || !is_alternating(mode)) && (beam < lowBeam || beam > highBeam)) {
      char t[96];
      std::snprintf(t, sizeof t, "no echo of channel %d among the first %d packets", c, kStatisticPackets);
      input_fault(InputFault::kMalformed, ec::kFileIo, {level0Path, t});
    }
    beams[static_cast<std::size_t>(c)] = beam;
  }
  if (int st = frame.check(asainspar(insPath, channels.first(static_cast<std::size_t>(count)), mode, beams))) return st;

  for (int c = 0; c < count; ++c) {
    const ChannelStatistic& s = stats[static_cast<std::size_t>(c)];
    sarpar& p = channels[static_cast<std::size_t>(c)];
    const int pri = s.most_frequent(ChannelStatistic::kPri);
    const int swl = s.most_frequent(ChannelStatistic::kSwl);
    if (pri <= 0 || swl <= 0 || !(p.samplingRate > 0.0)) {
      char t[128];
      std::snprintf(t, sizeof t, "channel %d: PRI code %d, window length %d, sampling frequency %g", c, pri, swl,
                    p.samplingRate);
      input_fault(InputFault::kMalformed, ec::kFileIo, {level0Path, "acquisition codes give no line grid", t});
    }
    p.prf = p.samplingRate / pri;
    p.pulse_length = s.most_frequent(ChannelStatistic::kPulse) / p.samplingRate;
    p.chirp_band_code = s.most_frequent(ChannelStatistic::kBandwidth);
    p.chirp_bandwidth = p.chirp_band_code * kChirpBandwidthStep;
    p.resampling_factor = 1;
    p.swl_code = swl;
    p.samples = swl;
    p.swl_noise_code = s.most_frequent(ChannelStatistic::kNoiseSwl);
    p.swst_code = s.most_frequent(ChannelStatistic::kSwst);
    p.swath_number = beams[static_cast<std::size_t>(c)];
    p.ss_order = order[static_cast<std::size_t>(c)];
  }
  return 0;
}

int asainspar(const std::string& insPath, std::span<sarpar> channels, int mode, std::span<const int> beamCodes) {
  sar::base::Frame frame("asainspar");
  check_mode(mode);
  if (beamCodes.size() < channels.size()) throw std::invalid_argument("asainspar: a beam code per channel");
  const InsRecord ins = InsRecord::read(insPath);
  const Timeline timeline = timeline_of(mode);
  for (std::size_t c = 0; c < channels.size(); ++c) {
    const int beam = is_alternating(mode) ? beamCodes[0] : beamCodes[c];
    InsParameters q;
    try {
      q = ins.parameters(timeline, beam);
    } catch (const std::out_of_range& e) {
      input_fault(InputFault::kMalformed, ec::kBadArguments, {insPath, "ASA_INS has no swath table for the beam", e.what()});
    }
    sarpar& p = channels[c];
    p.carrierFrequency = q.carrierFrequency;
    p.samplingRate = q.samplingFrequency;
    p.range_gate_bias = q.rangeGateBias;
    p.burst_echoes = q.burstEchoes;
    p.swath_rank = q.swathRank;
  }
  return 0;
}

int init_IM_table(const std::string& level0Path, LineTable& table, std::span<sarpar> channels,
                  const std::string& insPath) {
  sar::base::Frame frame("init_IM_table");
  const PacketMark first = first_packet(level0Path, kModeIM);
  if (int st = frame.check(loadparam(level0Path, insPath, kModeIM, channels))) return st;
  const PacketMark last = last_packet(level0Path, kModeIM);
  try {
    table = build_im_table(first, last, channels[0].prf);
  } catch (const std::invalid_argument& e) {
    char t[96];
    std::snprintf(t, sizeof t, "first packet counter %d, last %d", first.counter, last.counter);
    input_fault(InputFault::kMalformed, ec::kFileIo, {level0Path, e.what(), t});
  }
  return 0;
}

namespace {
// The builders' common failure: a table the timeline cannot give names the product and both ends.
[[noreturn]] void bad_timeline(const std::string& level0Path, const std::exception& e, const PacketMark& first,
                               const PacketMark& last) {
  char t[96];
  std::snprintf(t, sizeof t, "first packet counter %d, last %d", first.counter, last.counter);
  input_fault(InputFault::kMalformed, ec::kFileIo, {level0Path, e.what(), t});
}
}  // namespace

int init_AP_table(const std::string& level0Path, LineTable& table, std::span<sarpar> channels,
                  const std::string& insPath, int mode) {
  sar::base::Frame frame("init_AP_table");
  if (!is_alternating(mode)) fatal(ec::kBadArguments, {level0Path, "not an alternating polarisation mode"});
  const PacketMark first = first_packet(level0Path, mode);
  if (int st = frame.check(loadparam(level0Path, insPath, mode, channels))) return st;
  const PacketMark last = last_packet(level0Path, mode);
  const std::int32_t blockEchoes = channels[0].burst_echoes;
  channels[1].burst_echoes = blockEchoes;
  for (std::size_t c = 0; c < 2; ++c) channels[c].cycle_time = ap_cycle_time(channels[0].prf, blockEchoes);
  try {
    table = build_ap_table(first, last, channels[0].prf, blockEchoes);
  } catch (const std::invalid_argument& e) {
    bad_timeline(level0Path, e, first, last);
  }
  return 0;
}

int init_WS_table(const std::string& level0Path, LineTable& table, std::span<sarpar> channels,
                  const std::string& insPath) {
  sar::base::Frame frame("init_WS_table");
  const PacketMark first = first_packet(level0Path, kModeWS);
  if (int st = frame.check(loadparam(level0Path, insPath, kModeWS, channels))) return st;
  const PacketMark last = last_packet(level0Path, kModeWS);
  std::array<WsSwathTimeline, 5> swaths{};
  std::array<int, 5> order{};
  for (std::size_t s = 0; s < 5; ++s) {
    swaths[s] = {channels[s].prf, channels[s].swath_rank, channels[s].burst_echoes};
    order[s] = channels[s].ss_order;
  }
  try {
    table = build_ws_table(first, last, swaths, order);
  } catch (const std::invalid_argument& e) {
    bad_timeline(level0Path, e, first, last);
  }
  return 0;
}

TableBuilder timeline_table_builder() {
  return [](const std::string& level0Path, const std::string& insPath, int mode, LineTable& table,
            std::span<sarpar> channels) -> int {
    if (mode == kModeIM) return init_IM_table(level0Path, table, channels, insPath);
    if (mode == kModeWS) return init_WS_table(level0Path, table, channels, insPath);
    if (is_alternating(mode)) return init_AP_table(level0Path, table, channels, insPath, mode);
    const char* letters = mode >= kModeIM && mode <= kModeGM ? mode_info(mode).letters : "?";
    input_fault(InputFault::kWrongType, ec::kBadArguments, {level0Path, "no timeline table for the acquisition mode", letters});
  };
}

}  // namespace sar::envisat

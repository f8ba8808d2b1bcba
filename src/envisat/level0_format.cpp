// Byte layer of ASAR level 0 products.
#include "envisat/level0_format.hpp"

#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <string_view>
#include <vector>

#include "base/convert.hpp"
#include "base/errors.hpp"
#include "envisat/aux_products.hpp"
#include "envisat/product_types.hpp"

namespace sar::envisat {

namespace {

constexpr std::array<ModeInfo, 6> kModes = {{
    {"IM", 1, 84, 1556, 1, 6},
    {"WS", 5, 91, 1563, 15, 4},
    {"APC", 2, 103, 1543, 1, 6},
    {"APH", 2, 104, 1544, 1, 6},
    {"APV", 2, 164, 1549, 1, 6},
    {"GM", 5, 171, 1387, 15, 4},
}};

int u16(HeadBytes h, std::size_t at) { return (int{h[at]} << 8) | int{h[at + 1]}; }
std::uint32_t u32(HeadBytes h, std::size_t at) {
  return (std::uint32_t{h[at]} << 24) | (std::uint32_t{h[at + 1]} << 16) | (std::uint32_t{h[at + 2]} << 8) |
         std::uint32_t{h[at + 3]};
}

// Bytes after the headers searched for the first clean packet head of a product whose sub-mode
// only its packets tell.
constexpr std::size_t kModeSearchBytes = 1 << 20;

std::string fmt(const char* format, int a, int b) {
  char text[128];
  std::snprintf(text, sizeof text, format, a, b);
  return text;
}

// Millionths of a degree as a signed decimal text ("+0039574766"); nullopt-like NaN-free: 0 when
// the text holds no number, the latitude is an annotation and not worth failing for.
double parse_latitude(std::string_view text) {
  std::string s(text);
  char* end = nullptr;
  const double v = std::strtod(s.c_str(), &end);
  return end == s.c_str() ? 0.0 : v;
}

}  // namespace

const ModeInfo& mode_info(int mode) { return kModes.at(static_cast<std::size_t>(mode)); }
bool is_alternating(int mode) { return mode == kModeAPC || mode == kModeAPH || mode == kModeAPV; }
bool is_burst_mode(int mode) { return mode == kModeWS || mode == kModeGM; }

std::array<int, 2> ap_polarisations(int mode) {
  switch (mode) {
    case kModeAPC: return {1, 0};  // V/V, H/H
    case kModeAPH: return {2, 0};  // H/V, H/H
    default: return {1, 3};        // APV: V/V, V/H
  }
}

int ap_channel(int mode, bool txV, bool rxV) {
  switch (mode) {
    case kModeAPC:
      if (txV && rxV) return 0;
      if (!txV && !rxV) return 1;
      return -1;
    case kModeAPH:
      if (!txV && rxV) return 0;
      if (!txV && !rxV) return 1;
      return -1;
    default:
      if (txV && rxV) return 0;
      if (txV && !rxV) return 1;
      return -1;
  }
}


PacketHead decode_packet_head(HeadBytes h) {
  PacketHead p;
  p.days = u32(h, l0::kSensingTime);
  p.seconds = u32(h, l0::kSensingTime + 4);
  p.microseconds = u32(h, l0::kSensingTime + 8);
  p.time = sar::base::mjd2sec85(h.data() + l0::kSensingTime);
  p.processId = ((h[l0::kProcessId] & 7) << 8) + h[l0::kProcessId + 1];
  p.sequenceCount = ((h[l0::kSequenceCount] & 63) << 8) + h[l0::kSequenceCount + 1];
  p.packetLength = u16(h, l0::kPacketLength);
  p.fieldHeaderLength = u16(h, l0::kFieldHeaderLength);
  p.modeId = h[l0::kModeId];
  p.modeCounter = (int{h[l0::kModeCounter]} << 16) + (int{h[l0::kModeCounter + 1]} << 8) + h[l0::kModeCounter + 2];
  p.beamCode = h[l0::kBeamCode] >> 2;
  const int flags = h[l0::kFlags];
  p.echo = (flags & 0x80) != 0;
  p.noise = (flags & 0x40) != 0;
  p.calibration = (flags & 0x30) == 0x30;
  p.cyclePosition = ((flags & 15) << 8) + h[l0::kCyclePosition + 1];
  p.priCode = u16(h, l0::kPriCode);
  p.swstCode = u16(h, l0::kSwstCode);
  p.swlCode = u16(h, l0::kSwlCode);
  const int pol = h[l0::kPolarisationRow];
  p.txV = (pol & 0x40) != 0;
  p.rxV = (pol & 0x20) != 0;
  p.calibrationRow = pol & 31;
  p.pulseLengthCode = (int{h[l0::kPulseLength]} << 2) + (h[l0::kPulseLength + 1] >> 6);
  p.chirpBandwidthCode = h[l0::kChirpBandwidth];
  return p;
}

int check_packet_header(HeadBytes head, int mode, std::string* message) {
  const ModeInfo& m = mode_info(mode);
  // Only the fields scored: the resynchronisation search scores every byte offset of a block.
  struct {
    int processId, sequenceCount, fieldHeaderLength, modeId, beamCode;
  } p{};
  p.processId = ((head[l0::kProcessId] & 7) << 8) + head[l0::kProcessId + 1];
  p.sequenceCount = ((head[l0::kSequenceCount] & 63) << 8) + head[l0::kSequenceCount + 1];
  p.fieldHeaderLength = u16(head, l0::kFieldHeaderLength);
  p.modeId = head[l0::kModeId];
  p.beamCode = head[l0::kBeamCode] >> 2;
  // The search calls this at every byte offset: the text of the last failed test is only
  // formatted when asked for.
  int score = 0;
  const char* lastFormat = nullptr;
  int lastA = 0, lastB = 0;
  auto failed = [&](int weight, const char* format, int a, int b) {
    score += weight;
    lastFormat = format;
    lastA = a;
    lastB = b;
  };
  const int counterLow = ((head[l0::kModeCounter + 1] & 63) << 8) + head[l0::kModeCounter + 2];
  if (counterLow != p.sequenceCount)
    failed(l0::kScoreCounter, "Counter ERROR: MODE COUNTER=%d, SEQ_COUNT=%d.\n", counterLow, p.sequenceCount);
  if (p.processId != m.processId)
    failed(l0::kScoreProcessId, "ApplicationID ERROR: read=%d, expected=%d\n", p.processId, m.processId);
  if (p.modeId != m.modeId) failed(l0::kScoreModeId, "ModeID ERROR: read=%d, expected=%d\n", p.modeId, m.modeId);
  if (p.fieldHeaderLength != l0::kFieldHeaderBytes)
    failed(l0::kScoreFieldHeader, "Header length ERROR: read=%d, expected=%d\n", p.fieldHeaderLength,
           l0::kFieldHeaderBytes);
  const int swath = p.beamCode - m.beamOffset;
  if (swath < 0 || swath > m.maxSwath) failed(l0::kScoreSwath, "Swath %d out of range.\n", swath, 0);
  if (message) *message = lastFormat ? fmt(lastFormat, lastA, lastB) : std::string();
  return score;
}

int alternating_mode_of_packets(const std::string& path) {
  std::ifstream in(path, std::ios::binary);
  if (!in) return -1;
  in.seekg(l0::kFirstMdsr);
  std::vector<std::uint8_t> block(kModeSearchBytes);
  in.read(reinterpret_cast<char*>(block.data()), static_cast<std::streamsize>(block.size()));
  const auto got = static_cast<std::size_t>(in.gcount());
  // The first head that is clean for one of the three sub-modes names it; a head that passes
  // every test but the mode identifier does not.
  for (std::size_t at = 0; at + l0::kHeadSize <= got; ++at) {
    const HeadBytes head(block.data() + at, l0::kHeadSize);
    for (const int mode : {kModeAPC, kModeAPH, kModeAPV})
      if (check_packet_header(head, mode) == 0) return mode;
  }
  return -1;
}

Level0Header read_level0_header(const std::string& path) {
  namespace fs = std::filesystem;
  using sar::base::fatal;
  using sar::base::input_fault;
  using sar::base::InputFault;
  namespace ec = sar::base::ec;
  std::error_code err;
  if (!fs::is_regular_file(path, err)) input_fault(InputFault::kMissing, ec::kImageMissing, {path, "level 0 product not found"});
  const auto size = fs::file_size(path, err);
  if (err) input_fault(InputFault::kMissing, ec::kFileIo, {path, "size of the level 0 product cannot be read"});

  Level0Header h;
  h.fileSize = static_cast<std::int64_t>(size);
  if (h.fileSize < l0::kFirstMdsr) {
    char where[96];
    std::snprintf(where, sizeof where, "%lld bytes, headers need %lld", static_cast<long long>(h.fileSize),
                  static_cast<long long>(l0::kFirstMdsr));
    input_fault(InputFault::kTruncated, ec::kFileIo, {path, "level 0 product shorter than its headers", where});
  }
  std::vector<char> bytes(static_cast<std::size_t>(l0::kFirstMdsr));
  std::ifstream in(path, std::ios::binary);
  if (!in.read(bytes.data(), static_cast<std::streamsize>(bytes.size())))
    input_fault(InputFault::kMissing, ec::kFileIo, {path, "level 0 headers cannot be read"});
  const std::string_view mph(bytes.data(), static_cast<std::size_t>(l0::kMphSize));
  const std::string_view sph(bytes.data() + l0::kMphSize, static_cast<std::size_t>(l0::kSphSize));

  // The product name as the typing reads it: up to the first blank or quote.
  std::string_view name = mph.substr(kMphProductOffset, kMphProductLength);
  name = name.substr(0, std::min(name.find_first_of(" \"\n"), name.size()));
  h.product = std::string(name);
  const std::array<int, 5> level0Types = {kAsaIm0, kAsaWs0, kAsaApc, kAsaAph, kAsaApv};
  for (int t : level0Types)
    if (h.product.starts_with(product_type_prefix(t))) h.productType = t;
  // The archive names every alternating polarisation product "ASA_AP__0P" and its SPH says
  // "AP_": the sub-mode is then told by the packets alone.
  const bool genericAp = h.productType == 0 && h.product.starts_with(kGenericApPrefix);
  if (h.productType == 0 && !genericAp) input_fault(InputFault::kWrongType, ec::kBadArguments, {path, "not an ASAR level 0 product", h.product});

  h.mode = -1;
  for (int m = 0; m < static_cast<int>(kModes.size()); ++m) {
    const std::string_view letters = kModes[static_cast<std::size_t>(m)].letters;
    if (sph.substr(l0::kSphModeLetters, letters.size()) == letters) {
      h.mode = m;
      break;
    }
  }
  const bool sphSaysAp = h.mode < 0 && sph.substr(l0::kSphModeLetters, 3) == "AP_";
  if (genericAp || sphSaysAp) {
    const int packetMode = alternating_mode_of_packets(path);
    // A name or SPH that states the sub-mode must agree with the packets.
    if (h.mode >= 0 && h.mode != packetMode) h.mode = -1;
    else h.mode = packetMode;
    h.modeFromPackets = true;
    if (genericAp && h.mode >= 0) h.productType = kAsaApc + (h.mode - kModeAPC);
  }
  const bool modeMatchesType = (h.mode == kModeIM && h.productType == kAsaIm0) ||
                               (h.mode == kModeWS && h.productType == kAsaWs0) ||
                               (is_alternating(h.mode) && (h.productType == kAsaApc || h.productType == kAsaAph ||
                                                           h.productType == kAsaApv));
  if (!modeMatchesType)
    input_fault(InputFault::kContradicts, ec::kBadArguments, {path, "level 0 SPH mode letters do not match the product",
                              std::string(sph.substr(l0::kSphModeLetters, 3))});
  h.channels = mode_info(h.mode).channels;

  const double startLat = parse_latitude(sph.substr(l0::kSphStartLat, l0::kSphLatWidth));
  const double stopLat = parse_latitude(sph.substr(l0::kSphStopLat, l0::kSphLatWidth));
  h.sceneCentreLatitude = (startLat + stopLat) * 5e-7;

  const std::string_view pol = sph.substr(l0::kSphPolarisation, l0::kSphPolarisationWidth);
  const std::array<std::string_view, 4> pols = {"H/H  ", "V/V  ", "H/V  ", "V/H  "};
  for (int k = 0; k < 4; ++k)
    if (pol == pols[static_cast<std::size_t>(k)]) h.polarizationType = k;
  {
    const std::string field(mph.substr(kMphTotSizePos, kMphTotSizeWidth));
    char* end = nullptr;
    const long long stated = std::strtoll(field.c_str(), &end, 10);
    if (end != field.c_str()) h.statedSize = stated;
  }
  const char digit = sph[l0::kSphSwathDigit];
  if (digit >= '0' && digit <= '9') h.swathDigit = digit - '0';
  return h;
}

}  // namespace sar::envisat

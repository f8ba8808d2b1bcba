#pragma once
// Byte layer of ASAR level 0 products: the header fields taken by position, the 68-byte head of
// each measurement data set record (MDSR), the mode table and the scoring of a head.
//
// A level 0 product is a 1247-byte MPH, a 1956-byte SPH, then MDSRs from byte 3203. Each MDSR
// is a 68-byte head (sensing time, ground station annotation, the instrument source packet's
// headers) and a payload of L - 29 bytes, L being the packet data length of the head.
#include <array>
#include <cstddef>
#include <cstdint>
#include <span>
#include <string>
#include <string_view>

namespace sar::envisat {

namespace l0 {
inline constexpr std::int64_t kMphSize = 1247;
inline constexpr std::int64_t kSphSize = 1956;
inline constexpr std::int64_t kFirstMdsr = kMphSize + kSphSize;  // 3203, fixed: the DSD is not consulted

// SPH byte positions.
inline constexpr std::size_t kSphModeLetters = 20;      // "IM", "WS", "APC", "APH", "APV", "GM"
inline constexpr std::size_t kSphStartLat = 56;         // 11 characters, millionths of a degree
inline constexpr std::size_t kSphStopLat = 120;
inline constexpr std::size_t kSphLatWidth = 11;
inline constexpr std::size_t kSphPolarisation = 775;    // "H/H  " ...
inline constexpr std::size_t kSphPolarisationWidth = 5;
inline constexpr std::size_t kSphSwathDigit = 791;      // last character of the swath name

// MDSR head byte positions.
inline constexpr std::size_t kHeadSize = 68;
inline constexpr std::size_t kSensingTime = 0;          // MJD 2000: days, seconds, microseconds
inline constexpr std::size_t kProcessId = 32;           // low 11 of 16 bits
inline constexpr std::size_t kSequenceCount = 34;       // low 14 of 16 bits
inline constexpr std::size_t kPacketLength = 36;        // L
inline constexpr std::size_t kFieldHeaderLength = 38;   // must be 29
inline constexpr std::size_t kModeId = 41;
inline constexpr std::size_t kModeCounter = 48;         // 24 bits
inline constexpr std::size_t kBeamCode = 51;            // bits 7-2
inline constexpr std::size_t kFlags = 52;               // echo bit 7, noise bit 6, calibration bits 5-4
inline constexpr std::size_t kCyclePosition = 52;       // low 12 of 16 bits
inline constexpr std::size_t kPriCode = 54;
inline constexpr std::size_t kSwstCode = 56;
inline constexpr std::size_t kSwlCode = 58;
inline constexpr std::size_t kPolarisationRow = 61;     // tx bit 6, rx bit 5, calibration row bits 4-0
inline constexpr std::size_t kPulseLength = 62;         // 10 bits
inline constexpr std::size_t kChirpBandwidth = 64;

inline constexpr int kFieldHeaderBytes = 29;
/// Record bytes besides the payload: the record is L + 39 bytes, the payload L - 29.
inline constexpr std::int64_t kRecordOverhead = 39;

// Score weights of a head.
inline constexpr int kScoreCounter = 12;
inline constexpr int kScoreProcessId = 4;
inline constexpr int kScoreModeId = 4;
inline constexpr int kScoreFieldHeader = 4;
inline constexpr int kScoreSwath = 12;
/// A head scoring this or more means synchronisation is lost.
inline constexpr int kScoreLost = 12;
}  // namespace l0

/// Acquisition modes (the `acquisition_mode` numbers).
enum AcquisitionMode : int { kModeIM = 0, kModeWS = 1, kModeAPC = 2, kModeAPH = 3, kModeAPV = 4, kModeGM = 5 };

struct ModeInfo {
  const char* letters;
  int channels;
  int modeId;
  int processId;
  int beamOffset;  // swath index = beam code - beamOffset
  int maxSwath;    // valid swath index range 0 to maxSwath
};

/// Mode table; `mode` must be 0 to 5.
const ModeInfo& mode_info(int mode);
bool is_alternating(int mode);
bool is_burst_mode(int mode);  // WS and GM

/// Polarisation codes (0 H/H, 1 V/V, 2 H/V, 3 V/H) of the two channels of an alternating
/// polarisation mode.
std::array<int, 2> ap_polarisations(int mode);
/// Channel of an alternating polarisation echo by its transmit and receive bits (V = true);
/// -1 for a pair the mode does not hold.
int ap_channel(int mode, bool txV, bool rxV);

/// Kind of a packet by its flags.
enum class PacketFlagKind { kEcho, kNoise, kCalibration, kOther };

/// The decoded fields of one MDSR head.
struct PacketHead {
  std::uint32_t days = 0, seconds = 0, microseconds = 0;
  double time = 0.0;  // sec85
  int processId = 0;
  int sequenceCount = 0;
  int packetLength = 0;  // L
  int fieldHeaderLength = 0;
  int modeId = 0;
  int modeCounter = 0;
  int beamCode = 0;
  bool echo = false;
  bool noise = false;
  bool calibration = false;  // bits 5 and 4 both set
  int cyclePosition = 0;
  int priCode = 0;
  int swstCode = 0;
  int swlCode = 0;
  bool txV = false;
  bool rxV = false;
  int calibrationRow = 0;
  int pulseLengthCode = 0;
  int chirpBandwidthCode = 0;

  std::int64_t payload_bytes() const { return std::int64_t{packetLength} - l0::kFieldHeaderBytes; }
};

using HeadBytes = std::span<const std::uint8_t, l0::kHeadSize>;

PacketHead decode_packet_head(HeadBytes head);

/// Score of a head: 0 is clean, 12 or more is lost synchronisation. When `message` is given it
/// receives the text of the last failed test (the swath failure ends the scoring at once).
int check_packet_header(HeadBytes head, int mode, std::string* message = nullptr);

/// What the two level 0 headers say.
struct Level0Header {
  std::string product;      // MPH product name
  int productType = 0;      // type code of the product typing
  int mode = 0;             // acquisition mode from the SPH letters
  int channels = 0;
  double sceneCentreLatitude = 0.0;  // degrees
  int polarizationType = -1;         // from the SPH polarisation, -1 when unknown
  int swathDigit = -1;               // IM swath digit, -1 when not a digit
  std::int64_t fileSize = 0;
  std::int64_t statedSize = -1;  // MPH TOT_SIZE, -1 when the field does not read as a number
  bool modeFromPackets = false;  // an alternating polarisation sub-mode told by the packets
};

/// Name prefix of the archive's alternating polarisation level 0 products, whatever sub-mode.
inline constexpr std::string_view kGenericApPrefix = "ASA_AP__0";

/// The alternating polarisation sub-mode (kModeAPC, kModeAPH, kModeAPV) of the first packet head
/// that is clean for one of them, searched in the first megabyte of packets; -1 when none is.
int alternating_mode_of_packets(const std::string& path);

/// Reads and checks the headers of a level 0 product. Raises the image-missing code for an
/// absent file, the bad-argument code for a file of another type or an unknown mode, and the
/// file I/O code for a product too short to hold its headers; all name the file.
Level0Header read_level0_header(const std::string& path);

}  // namespace sar::envisat

#pragma once
// The step before the packet walk: what the acquisition was and which packets to expect.
//
// `loadparam` takes the acquisition parameters of each channel from a statistic over the first
// packets of the product (the most frequent window, pulse, bandwidth, PRI, beam and SWST codes)
// and from ASA_INS (`asainspar`). The table builders then need only the first and the last
// packet of the stream and the instrument's timeline; the packets in between are not read.
//
// Bad input (no clean head, no whole packet, codes that give no PRF or no beam) raises the file
// I/O code naming the level 0 product, so a broken product stops here rather than in the walk.
#include <cstdint>
#include <span>
#include <string>

#include "envisat/extract.hpp"
#include "envisat/line_table.hpp"
#include "envisat/records.hpp"

namespace sar::envisat {

/// Heads looked at for the parameter statistic.
inline constexpr int kStatisticPackets = 1000;
/// Bytes read at once when searching for a clean head, and at the end for the last packet.
inline constexpr std::int64_t kHeadSearchBlock = 600000;
/// Chirp bandwidth of one code step: 16 MHz in 255 steps.
inline constexpr double kChirpBandwidthStep = 62745.098039215685;

/// First packet: the first head from byte 3203 on that scores clean.
PacketMark first_packet(const std::string& level0Path, int mode);

/// Last packet: scanning back from the end of the file, the first head that scores clean, whose
/// payload lies whole in the file and that is an echo (any kind in wide swath and GM).
PacketMark last_packet(const std::string& level0Path, int mode);

/// Acquisition parameters of `channels` (as many as the mode has) from the first packets and
/// ASA_INS. Returns 0.
int loadparam(const std::string& level0Path, const std::string& insPath, int mode, std::span<sarpar> channels);

/// Carrier, sampling frequency, range gate bias, echoes per burst and rank of each channel from
/// ASA_INS, for the beam codes given per channel (alternating polarisation: channel 0's code
/// serves both). Returns 0.
int asainspar(const std::string& insPath, std::span<sarpar> channels, int mode, std::span<const int> beamCodes);

/// IM table of a product; fills the channel's parameters first. Returns 0.
int init_IM_table(const std::string& level0Path, LineTable& table, std::span<sarpar> channels,
                  const std::string& insPath);

/// Alternating polarisation table of a product of mode APC, APH or APV; fills both channels'
/// parameters first, gives channel 1 the block length L of channel 0 and both the cycle time
/// 2 L / prf. Returns 0.
int init_AP_table(const std::string& level0Path, LineTable& table, std::span<sarpar> channels,
                  const std::string& insPath, int mode);

/// Wide swath table; fills the five sub-swaths' parameters first (their firing order in
/// `ss_order`: entry k names the sub-swath fired k-th). Returns 0.
int init_WS_table(const std::string& level0Path, LineTable& table, std::span<sarpar> channels,
                  const std::string& insPath);

/// The builder the jobs hand `envi_extract`, for every mode that has a timeline: IM, APC, APH,
/// APV and WS. GM raises the bad-argument code naming the product.
TableBuilder timeline_table_builder();

}  // namespace sar::envisat

#pragma once
// Product typing by header: what an ENVISAT file is, read from its MPH product name, never
// from its file name.
#include <optional>
#include <string>
#include <string_view>

namespace sar::envisat {

/// MPH layout: all ENVISAT products open with a 1247-byte ASCII main product header.
inline constexpr std::size_t kMphSize = 1247;
inline constexpr std::size_t kMphProductOffset = 9;    // after PRODUCT="
inline constexpr std::size_t kMphProductLength = 62;
inline constexpr std::size_t kMphSensingStartOffset = 351;
inline constexpr std::size_t kMphSensingStopOffset = 394;
inline constexpr std::size_t kTimeTextLength = 27;

/// Type codes, in the order find_type tests them.
enum ProductType : int {
  kUnknownProduct = 0,
  kAsaAps = 1,
  kAsaApp = 2,
  kAsaApm = 3,
  kAsaApc = 4,
  kAsaAph = 5,
  kAsaApv = 6,
  kAsaIms = 7,
  kAsaIm0 = 8,
  kAsaWss = 9,
  kAsaWsm = 10,
  kAsaWs0 = 11,
  kDorVor = 12,
  kDorPor = 13,
  kAsaXca = 14,
  kAsaXch = 15,
  kAsaIns = 16,
};

/// Product-name prefix of a type code ("ASA_IM__0" for kAsaIm0), empty for kUnknownProduct.
std::string_view product_type_prefix(int code);

class EnvisatTypes {
 public:
  explicit EnvisatTypes(std::string path);

  /// First matching code in table order, or 0 (also for an unreadable or short file).
  int find_type() const;
  bool is_aps() const { return is(kAsaAps); }
  bool is_app() const { return is(kAsaApp); }
  bool is_apm() const { return is(kAsaApm); }
  bool is_apc() const { return is(kAsaApc); }
  bool is_aph() const { return is(kAsaAph); }
  bool is_apv() const { return is(kAsaApv); }
  bool is_ims() const { return is(kAsaIms); }
  bool is_im0() const { return is(kAsaIm0); }
  bool is_wss() const { return is(kAsaWss); }
  bool is_wsm() const { return is(kAsaWsm); }
  bool is_ws0() const { return is(kAsaWs0); }
  bool is_dorvor() const { return is(kDorVor); }
  bool is_dorpor() const { return is(kDorPor); }
  bool is_xca() const { return is(kAsaXca); }
  bool is_xch() const { return is(kAsaXch); }
  bool is_ins() const { return is(kAsaIns); }

  /// 1 when the orbit file's validity span holds this product's sensing start strictly inside,
  /// else 0 (also when either file cannot be read or this is not an ASAR product, codes 1-11).
  int check_dorvor(const std::string& orbitPath) const;

  /// The MPH product name as "%62s" reads it, or nullopt when the file is unreadable or short.
  std::optional<std::string> product_name() const;
  const std::string& path() const { return path_; }

 private:
  bool is(int code) const;
  std::string path_;
};

/// Read `length` bytes at `offset` of a file; nullopt when the file is shorter or unreadable.
std::optional<std::string> read_text_at(const std::string& path, std::size_t offset, std::size_t length);

}  // namespace sar::envisat

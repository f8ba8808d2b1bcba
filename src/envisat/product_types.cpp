#include "envisat/product_types.hpp"

#include <array>
#include <fstream>

#include "base/convert.hpp"

namespace sar::envisat {
namespace {

constexpr std::array<std::string_view, 17> kPrefixes = {
    "",        "ASA_APS", "ASA_APP",   "ASA_APM", "ASA_APC", "ASA_APH", "ASA_APV", "ASA_IMS",   "ASA_IM__0",
    "ASA_WSS", "ASA_WSM", "ASA_WS__0", "DOR_VOR", "DOR_POR", "ASA_XCA", "ASA_XCH", "ASA_INS"};

}  // namespace

std::string_view product_type_prefix(int code) {
  return code > 0 && code < static_cast<int>(kPrefixes.size()) ? kPrefixes[static_cast<std::size_t>(code)] : "";
}

std::optional<std::string> read_text_at(const std::string& path, std::size_t offset, std::size_t length) {
  std::ifstream in(path, std::ios::binary);
  if (!in) return std::nullopt;
  in.seekg(static_cast<std::streamoff>(offset));
  std::string text(length, '\0');
  in.read(text.data(), static_cast<std::streamsize>(length));
  if (in.gcount() != static_cast<std::streamsize>(length)) return std::nullopt;
  return text;
}

EnvisatTypes::EnvisatTypes(std::string path) : path_(std::move(path)) {}

std::optional<std::string> EnvisatTypes::product_name() const {
  auto raw = read_text_at(path_, kMphProductOffset, kMphProductLength);
  if (!raw) return std::nullopt;
  // "%62s": skip leading white space, stop at the next.
  const auto isSpace = [](char c) { return c == ' ' || c == '\n' || c == '\t' || c == '\r' || c == '\0'; };
  std::size_t b = 0;
  while (b < raw->size() && isSpace((*raw)[b])) ++b;
  std::size_t e = b;
  while (e < raw->size() && !isSpace((*raw)[e])) ++e;
  return raw->substr(b, e - b);
}

bool EnvisatTypes::is(int code) const {
  const auto name = product_name();
  if (!name) return false;
  const std::string_view prefix = product_type_prefix(code);
  return name->size() >= prefix.size() && std::string_view(*name).substr(0, prefix.size()) == prefix;
}

int EnvisatTypes::find_type() const {
  const auto name = product_name();
  if (!name) return kUnknownProduct;
  for (int code = kAsaAps; code <= kAsaIns; ++code) {
    const std::string_view prefix = product_type_prefix(code);
    if (std::string_view(*name).substr(0, prefix.size()) == prefix) return code;
  }
  return kUnknownProduct;
}

int EnvisatTypes::check_dorvor(const std::string& orbitPath) const {
  const int code = find_type();
  if (code < kAsaAps || code > kAsaWs0) return 0;
  const auto t = read_text_at(path_, kMphSensingStartOffset, kTimeTextLength);
  const auto start = read_text_at(orbitPath, kMphSensingStartOffset, kTimeTextLength);
  const auto stop = read_text_at(orbitPath, kMphSensingStartOffset + kTimeTextLength + 16, kTimeTextLength);
  if (!t || !start || !stop) return 0;
  const double tp = base::ascii2sec85(*t);
  return base::ascii2sec85(*start) < tp && tp < base::ascii2sec85(*stop) ? 1 : 0;
}

}  // namespace sar::envisat

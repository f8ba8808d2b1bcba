#pragma once
// Bounds-checked big-endian reads over a byte record held in memory.
//
// Every multi-byte value of an ENVISAT product is big-endian and is assembled from bytes here,
// never read as a machine word. A read that would leave the record is bad input: it raises the
// file I/O error naming the file, the field and the byte offset, so a broken product fails
// loudly instead of being read out of bounds.
#include <bit>
#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <span>
#include <string>
#include <string_view>

#include "base/errors.hpp"

namespace sar::envisat::detail {

class BeReader {
 public:
  /// `bytes` is a record that starts at file position `fileBase` of `path`; offsets given to the
  /// reads are relative to the record, messages give both.
  BeReader(std::span<const std::uint8_t> bytes, std::string_view path, std::uint64_t fileBase = 0)
      : bytes_(bytes), path_(path), fileBase_(fileBase) {}

  std::size_t size() const { return bytes_.size(); }

  std::uint8_t u8(std::uint64_t offset, std::string_view field) const { return *at(offset, 1, field); }

  std::uint16_t u16(std::uint64_t offset, std::string_view field) const {
    const std::uint8_t* p = at(offset, 2, field);
    return static_cast<std::uint16_t>((p[0] << 8) | p[1]);
  }

  std::uint32_t u32(std::uint64_t offset, std::string_view field) const {
    const std::uint8_t* p = at(offset, 4, field);
    return (std::uint32_t{p[0]} << 24) | (std::uint32_t{p[1]} << 16) | (std::uint32_t{p[2]} << 8) | p[3];
  }

  std::int32_t i32(std::uint64_t offset, std::string_view field) const {
    return static_cast<std::int32_t>(u32(offset, field));
  }

  float f32(std::uint64_t offset, std::string_view field) const { return std::bit_cast<float>(u32(offset, field)); }

  double f64(std::uint64_t offset, std::string_view field) const {
    const std::uint8_t* p = at(offset, 8, field);
    std::uint64_t v = 0;
    for (int i = 0; i < 8; ++i) v = (v << 8) | p[i];
    return std::bit_cast<double>(v);
  }

  /// The raw bytes of a field, checked as a whole.
  std::span<const std::uint8_t> bytes(std::uint64_t offset, std::uint64_t length, std::string_view field) const {
    return {at(offset, length, field), static_cast<std::size_t>(length)};
  }

 private:
  const std::uint8_t* at(std::uint64_t offset, std::uint64_t length, std::string_view field) const {
    if (offset > bytes_.size() || length > bytes_.size() - offset) {
      char where[160];
      std::snprintf(where, sizeof where, "offset %llu (file byte %llu), %llu bytes, record of %zu bytes",
                    static_cast<unsigned long long>(offset), static_cast<unsigned long long>(fileBase_ + offset),
                    static_cast<unsigned long long>(length), bytes_.size());
      sar::base::input_fault(sar::base::InputFault::kTruncated, sar::base::ec::kFileIo, {std::string(path_), std::string(field), where});
    }
    return bytes_.data() + offset;
  }

  std::span<const std::uint8_t> bytes_;
  std::string path_;
  std::uint64_t fileBase_;
};

}  // namespace sar::envisat::detail

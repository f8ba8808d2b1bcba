#include "io/cell_types.hpp"

#include <algorithm>
#include <array>
#include <cmath>
#include <cstring>
#include <limits>
#include <type_traits>
#include <utility>

#include "base/convert.hpp"

namespace sar::io {

namespace {

struct TypeInfo {
  int size;
  int parts;
  std::string_view name;
};

constexpr std::array<TypeInfo, 10> kTypes{{
    {8, 2, "FLOAT_COMPLEX"},
    {4, 1, "FLOAT32"},
    {16, 2, "DOUBLE_COMPLEX"},
    {8, 1, "FLOAT64"},
    {8, 2, ""},
    {4, 1, "INT32"},
    {4, 2, "SHORT_COMPLEX"},
    {2, 1, "INT16"},
    {2, 2, "INT8_COMPLEX"},
    {1, 1, "INT8"},
}};

// Part type and part count of each code, for the conversion kernels.
template <int Code> struct Cell;
template <> struct Cell<0> { using Part = float; static constexpr int kParts = 2; };
template <> struct Cell<1> { using Part = float; static constexpr int kParts = 1; };
template <> struct Cell<2> { using Part = double; static constexpr int kParts = 2; };
template <> struct Cell<3> { using Part = double; static constexpr int kParts = 1; };
template <> struct Cell<4> { using Part = int32_t; static constexpr int kParts = 2; };
template <> struct Cell<5> { using Part = int32_t; static constexpr int kParts = 1; };
template <> struct Cell<6> { using Part = int16_t; static constexpr int kParts = 2; };
template <> struct Cell<7> { using Part = int16_t; static constexpr int kParts = 1; };
template <> struct Cell<8> { using Part = int8_t; static constexpr int kParts = 2; };
template <> struct Cell<9> { using Part = int8_t; static constexpr int kParts = 1; };

template <class F>
bool with_code(int32_t code, F&& f) {
  switch (code) {
    case 0: f(std::integral_constant<int, 0>{}); return true;
    case 1: f(std::integral_constant<int, 1>{}); return true;
    case 2: f(std::integral_constant<int, 2>{}); return true;
    case 3: f(std::integral_constant<int, 3>{}); return true;
    case 4: f(std::integral_constant<int, 4>{}); return true;
    case 5: f(std::integral_constant<int, 5>{}); return true;
    case 6: f(std::integral_constant<int, 6>{}); return true;
    case 7: f(std::integral_constant<int, 7>{}); return true;
    case 8: f(std::integral_constant<int, 8>{}); return true;
    case 9: f(std::integral_constant<int, 9>{}); return true;
    default: return false;
  }
}

// Half away from zero in double precision (so 0.49999997f stays below one half), then clamped:
// a value beyond the integer type would otherwise be undefined behaviour.
template <class D>
D round_to(double x) {
  if (std::isnan(x)) return D{0};
  const double r = x >= 0.0 ? std::floor(x + 0.5) : std::ceil(x - 0.5);
  constexpr double lo = static_cast<double>(std::numeric_limits<D>::min());
  constexpr double hi = static_cast<double>(std::numeric_limits<D>::max());
  if (r <= lo) return std::numeric_limits<D>::min();
  if (r >= hi) return std::numeric_limits<D>::max();
  return static_cast<D>(r);
}

template <class S, class D>
D convert_part(S v) {
  if constexpr (std::is_integral_v<D> && std::is_floating_point_v<S>) {
    return round_to<D>(static_cast<double>(v));
  } else {
    return static_cast<D>(v);
  }
}

template <class T>
T load(const unsigned char* p) {
  T v;
  std::memcpy(&v, p, sizeof v);
  return v;
}

template <class T>
void store(unsigned char* p, T v) {
  std::memcpy(p, &v, sizeof v);
}

template <int SC, int DC>
void convert_kernel(const unsigned char* src, unsigned char* dst, std::size_t cells) {
  using S = typename Cell<SC>::Part;
  using D = typename Cell<DC>::Part;
  constexpr int SP = Cell<SC>::kParts;
  constexpr int DP = Cell<DC>::kParts;
  for (std::size_t i = 0; i < cells; ++i) {
    const unsigned char* s = src + i * SP * sizeof(S);
    unsigned char* d = dst + i * DP * sizeof(D);
    store<D>(d, convert_part<S, D>(load<S>(s)));
    if constexpr (DP == 2) {
      if constexpr (SP == 2) {
        store<D>(d + sizeof(D), convert_part<S, D>(load<S>(s + sizeof(S))));
      } else {
        store<D>(d + sizeof(D), D{0});
      }
    }
  }
}

RasterSettings g_settings;

}  // namespace

bool cell_type_known(int32_t type) { return type >= 0 && type < static_cast<int32_t>(kTypes.size()); }

int cell_size(int32_t type) { return cell_type_known(type) ? kTypes[static_cast<size_t>(type)].size : 0; }

int cell_parts(int32_t type) { return cell_type_known(type) ? kTypes[static_cast<size_t>(type)].parts : 0; }

bool cell_is_complex(int32_t type) { return cell_parts(type) == 2; }

std::string_view cell_type_name(int32_t type) {
  return cell_type_known(type) ? kTypes[static_cast<size_t>(type)].name : std::string_view{};
}

int32_t cell_type_from_name(std::string_view name) {
  // The order in which the names are tried, as the readers of old headers always did.
  static constexpr std::array<int32_t, 9> kOrder{kFloat32, kInt32, kInt16, kFloatComplex, kShortComplex,
                                                 kDoubleComplex, kFloat64, kInt8, kInt8Complex};
  for (int32_t code : kOrder) {
    if (name == kTypes[static_cast<size_t>(code)].name) return code;
  }
  return -1;
}

bool convert_cells(const void* src, int32_t srcType, void* dst, int32_t dstType, std::size_t cells) {
  if (!cell_type_known(srcType) || !cell_type_known(dstType)) return false;
  if (cells == 0) return true;
  if (srcType == dstType) {
    std::memmove(dst, src, cells * static_cast<std::size_t>(cell_size(srcType)));
    return true;
  }
  const auto* s = static_cast<const unsigned char*>(src);
  auto* d = static_cast<unsigned char*>(dst);
  with_code(srcType, [&](auto sc) {
    with_code(dstType, [&](auto dc) { convert_kernel<decltype(sc)::value, decltype(dc)::value>(s, d, cells); });
  });
  return true;
}

void cells_to_host(void* data, int32_t type, std::size_t cells, int32_t fileOrder) {
  const int parts = cell_parts(type);
  if (parts == 0 || fileOrder == host_byte_order()) return;
  const auto part_size = static_cast<std::size_t>(cell_size(type) / parts);
  sar::base::get_endian(data, cells * static_cast<std::size_t>(parts), part_size, fileOrder);
}

void cells_from_host(void* data, int32_t type, std::size_t cells, int32_t fileOrder) {
  const int parts = cell_parts(type);
  if (parts == 0 || fileOrder == host_byte_order()) return;
  const auto part_size = static_cast<std::size_t>(cell_size(type) / parts);
  sar::base::swp_any(data, cells * static_cast<std::size_t>(cell_size(type)), part_size);
}

void prefix_swap(void* data, std::size_t bytes, int32_t fileOrder) {
  if (bytes < 2 || bytes % 2 != 0 || fileOrder == host_byte_order()) return;
  auto* p = static_cast<unsigned char*>(data);
  std::reverse(p, p + bytes);
}

int32_t host_byte_order() { return sar::base::my_endian() == 0 ? kLittleEndian : kBigEndian; }

const RasterSettings& raster_settings() { return g_settings; }

void set_raster_settings(const RasterSettings& settings) {
  g_settings = settings;
  if (g_settings.byte_order != kBigEndian) g_settings.byte_order = kLittleEndian;
}

int32_t byte_order_from_name(std::string_view name) { return name == "MSBFirst" ? kBigEndian : kLittleEndian; }

std::string_view byte_order_name(int32_t order) { return order == kBigEndian ? "MSBFirst" : "LSBFirst"; }

int64_t raster_line_pitch(int32_t samples, int32_t type, int32_t rowPrefix) {
  const int size = cell_size(type);
  if (size == 0 || samples < 0 || rowPrefix < 0) return -1;
  // At most (2^31 - 1) * 16 + 2^31 - 1: always fits.
  return static_cast<int64_t>(samples) * size + rowPrefix;
}

int64_t raster_line_offset(int64_t line, int64_t pitch, int64_t headerOffset) {
  int64_t out = 0;
  if (pitch < 0 || line < 0 || headerOffset < 0) return -1;
  if (__builtin_mul_overflow(line, pitch, &out) || __builtin_add_overflow(out, headerOffset, &out)) return -1;
  return out;
}

}  // namespace sar::io

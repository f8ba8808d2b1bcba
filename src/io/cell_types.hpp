#pragma once
// Cell types of rasters: codes, names in headers, sizes, byte order and conversion between the
// type of a file and the type of a caller's memory.
#include <complex>
#include <cstddef>
#include <cstdint>
#include <string_view>

namespace sar::io {

using fcomplex = std::complex<float>;
using dcomplex = std::complex<double>;

/// Cell type codes as headers store them (also `UnitType` of BufferFile).
enum CellType : int32_t {
  kFloatComplex = 0,   // "FLOAT_COMPLEX", two float32
  kFloat32 = 1,        // "FLOAT32"
  kDoubleComplex = 2,  // "DOUBLE_COMPLEX", two float64
  kFloat64 = 3,        // "FLOAT64"
  kIntComplex = 4,     // no header name: two int32
  kInt32 = 5,          // "INT32"
  kShortComplex = 6,   // "SHORT_COMPLEX", two int16
  kInt16 = 7,          // "INT16"
  kInt8Complex = 8,    // "INT8_COMPLEX", two int8
  kInt8 = 9,           // "INT8"
  kCellUnset = 10,     // never set: no cell size
};

/// Byte order codes of headers: 0 little-endian, 1 big-endian ("MSBFirst").
inline constexpr int32_t kLittleEndian = 0;
inline constexpr int32_t kBigEndian = 1;

bool cell_type_known(int32_t type);  // 0..9
/// Bytes per cell, 0 for an unknown or unset type.
int cell_size(int32_t type);

/// Bytes from one line's start to the next: samples of `type` plus the row prefix; -1 for an
/// unknown type or negative sizes.
int64_t raster_line_pitch(int32_t samples, int32_t type, int32_t rowPrefix);
/// File offset of `line` under a header of `headerOffset` bytes; -1 when out of range or when
/// the product does not fit in 64 bits.
int64_t raster_line_offset(int64_t line, int64_t pitch, int64_t headerOffset);
/// 2 for the complex types, 1 for the real ones, 0 for an unknown type.
int cell_parts(int32_t type);
bool cell_is_complex(int32_t type);
/// Header name of a type; empty for code 4 and for unknown codes.
std::string_view cell_type_name(int32_t type);
/// Code of a header name, -1 for an unknown name.
int32_t cell_type_from_name(std::string_view name);

/// Memory type of a caller's element type.
template <class T> constexpr int32_t cell_type_of();
template <> constexpr int32_t cell_type_of<fcomplex>() { return kFloatComplex; }
template <> constexpr int32_t cell_type_of<float>() { return kFloat32; }
template <> constexpr int32_t cell_type_of<dcomplex>() { return kDoubleComplex; }
template <> constexpr int32_t cell_type_of<double>() { return kFloat64; }
template <> constexpr int32_t cell_type_of<int32_t>() { return kInt32; }
template <> constexpr int32_t cell_type_of<int16_t>() { return kInt16; }

/// Converts `cells` cells of type `srcType` at `src` into `dstType` at `dst`:
///  - equal types copy the bytes;
///  - complex to complex and real to real convert part by part;
///  - real to complex gives the real part and an imaginary part of 0, complex to real keeps the
///    real part;
///  - a floating value on its way to an integer type rounds half away from zero (floor(x + 0.5)
///    at or above 0, ceil(x - 0.5) below), saturates at the type's limits and gives 0 for NaN;
///  - an integer to a narrower integer is a plain integer assignment (modulo 2^n).
/// Returns false, touching nothing, for a type outside 0..9. Buffers need no alignment.
bool convert_cells(const void* src, int32_t srcType, void* dst, int32_t dstType, std::size_t cells);

/// Brings cells read from a file of byte order `fileOrder` to the machine's order, part by part
/// (a complex cell is two parts of half its size).
void cells_to_host(void* data, int32_t type, std::size_t cells, int32_t fileOrder);
/// The reverse, before writing to a file of byte order `fileOrder`.
void cells_from_host(void* data, int32_t type, std::size_t cells, int32_t fileOrder);
/// A line prefix is one item of its full size: reversed as a whole for a file of the other byte
/// order when its size is even, left as it is when odd. The same rule serves reading and writing,
/// so a prefix survives a round trip in either order.
void prefix_swap(void* data, std::size_t bytes, int32_t fileOrder);

/// Machine byte order as a header code.
int32_t host_byte_order();

/// Process-wide defaults of files that the engine creates; the run services set them from the
/// host configuration (VANTERRA_DEFAULT_BYTE_ORDER).
struct RasterSettings {
  int32_t byte_order = kLittleEndian;
};
const RasterSettings& raster_settings();
void set_raster_settings(const RasterSettings& settings);
/// Byte order of a configuration or profile text: "MSBFirst" is big-endian, any other text
/// little-endian.
int32_t byte_order_from_name(std::string_view name);
std::string_view byte_order_name(int32_t order);  // "MSBFirst" or "LSBFirst"

}  // namespace sar::io

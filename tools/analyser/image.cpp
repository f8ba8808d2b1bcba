#include "analyser/image.hpp"

#include <algorithm>
#include <filesystem>
#include <span>
#include <stdexcept>
#include <system_error>

namespace sar::analyser {

namespace {

std::string type_text(std::int32_t type) {
  const std::string_view name = io::cell_type_name(type);
  return name.empty() ? "code " + std::to_string(type) : std::string(name);
}

}  // namespace

RasterLayout resolve_layout(const std::string& raster, const LayoutOverrides& given) {
  std::error_code ec;
  const auto file_size = std::filesystem::file_size(raster, ec);
  if (ec) throw std::runtime_error("cannot read raster " + raster + ": " + ec.message());

  RasterLayout layout;
  if (!given.any_size()) {
    const std::string hdr = raster + ".hdr";
    if (!std::filesystem::exists(hdr, ec)) {
      throw std::runtime_error("no header " + hdr + " (give --lines or --samples for a raster without one)");
    }
    io::DataFile df;
    if (df.read_hdr(raster) != 0) throw std::runtime_error("cannot read the raster header " + hdr);
    layout = {df.lines, df.pixels, df.headerOffset, df.rowPrefix, df.cellType, df.byteOrder};
  }
  if (given.lines) layout.lines = *given.lines;
  if (given.samples) layout.samples = *given.samples;
  if (given.row_prefix) layout.row_prefix = *given.row_prefix;
  if (given.cell_type) layout.cell_type = *given.cell_type;
  if (given.byte_order) layout.byte_order = *given.byte_order;
  if (given.header_offset) layout.header_offset = *given.header_offset;

  if (!io::cell_type_known(layout.cell_type) || !io::cell_is_complex(layout.cell_type)) {
    throw std::runtime_error("cell type " + type_text(layout.cell_type) + " is not complex");
  }
  if (layout.lines < 0 || layout.samples < 0 || layout.row_prefix < 0 || layout.header_offset < 0) {
    throw std::runtime_error("negative raster size");
  }
  const std::int64_t size = static_cast<std::int64_t>(file_size);
  const std::int64_t body = size - layout.header_offset;
  if (given.any_size() && (layout.lines == 0 || layout.samples == 0)) {
    // One size given: the other follows from the file size.
    if (body <= 0) throw std::runtime_error("raster " + raster + " holds nothing after its header");
    if (layout.samples == 0) {
      if (layout.lines == 0) throw std::runtime_error("a size of 0 lines");
      const std::int64_t pitch = body / layout.lines;
      const std::int64_t samples = (pitch - layout.row_prefix) / io::cell_size(layout.cell_type);
      if (pitch * layout.lines != body || samples <= 0 || samples > INT32_MAX ||
          samples * io::cell_size(layout.cell_type) + layout.row_prefix != pitch) {
        throw std::runtime_error("the raster size is not a whole number of lines of " + std::to_string(layout.lines));
      }
      layout.samples = static_cast<std::int32_t>(samples);
    } else {
      const std::int64_t pitch = io::raster_line_pitch(layout.samples, layout.cell_type, layout.row_prefix);
      if (pitch <= 0 || body % pitch != 0 || body / pitch > INT32_MAX) {
        throw std::runtime_error("the raster size is not a whole number of lines of " + std::to_string(layout.samples) +
                                 " samples");
      }
      layout.lines = static_cast<std::int32_t>(body / pitch);
    }
  }
  const std::int64_t pitch = io::raster_line_pitch(layout.samples, layout.cell_type, layout.row_prefix);
  const std::int64_t need = io::raster_line_offset(layout.lines, pitch, layout.header_offset);
  if (pitch < 0 || need < 0) throw std::runtime_error("impossible raster size");
  if (need > size) {
    throw std::runtime_error("raster " + raster + " holds " + std::to_string(size) + " bytes, its layout needs " +
                             std::to_string(need));
  }
  return layout;
}

PowerProfiles power_profiles(const ComplexImageView& image) {
  PowerProfiles p;
  if (!image.consistent()) return p;
  p.range.assign(static_cast<std::size_t>(image.samples), 0.0);
  p.azimuth.assign(static_cast<std::size_t>(image.lines), 0.0);
  for (int l = 0; l < image.lines; ++l) {
    double sum = 0.0;
    for (int s = 0; s < image.samples; ++s) {
      const double v = std::norm(std::complex<double>(image.at(l, s)));
      p.range[static_cast<std::size_t>(s)] += v;
      sum += v;
    }
    p.azimuth[static_cast<std::size_t>(l)] = image.samples > 0 ? sum / image.samples : 0.0;
  }
  if (image.lines > 0) {
    for (double& v : p.range) v /= image.lines;
  }
  return p;
}

RasterReader::RasterReader(const std::string& path, const RasterLayout& layout) : layout_(layout), file_(path) {
  file_.lines = layout.lines;
  file_.pixels = layout.samples;
  file_.headerOffset = layout.header_offset;
  file_.rowPrefix = layout.row_prefix;
  file_.cellType = layout.cell_type;
  file_.byteOrder = layout.byte_order;
  if (file_.open(0) != 0) throw std::runtime_error("cannot open raster " + path);
}

ComplexImage RasterReader::read(int first_line, int lines, int first_sample, int samples) {
  ComplexImage image;
  const int l0 = std::clamp(first_line, 0, layout_.lines);
  const int l1 = static_cast<int>(std::clamp(static_cast<std::int64_t>(first_line) + lines, std::int64_t{0},
                                             static_cast<std::int64_t>(layout_.lines)));
  const int s0 = std::clamp(first_sample, 0, layout_.samples);
  const int s1 = static_cast<int>(std::clamp(static_cast<std::int64_t>(first_sample) + samples, std::int64_t{0},
                                             static_cast<std::int64_t>(layout_.samples)));
  image.first_line = l0;
  image.first_sample = s0;
  if (l1 <= l0 || s1 <= s0) return image;
  image.lines = l1 - l0;
  image.samples = s1 - s0;
  image.data.resize(static_cast<std::size_t>(image.lines) * static_cast<std::size_t>(image.samples));
  io::BufferIO window(&file_, s0, image.samples, l0, image.lines, io::kFloatComplex);
  if (window.readbuffer(std::as_writable_bytes(std::span(image.data)), image.samples) != 0) {
    throw std::runtime_error("cannot read lines " + std::to_string(l0) + " to " + std::to_string(l1 - 1) + " of " +
                             file_.fileName);
  }
  return image;
}

PowerProfiles RasterReader::power_profiles(int block_lines) {
  PowerProfiles p;
  p.range.assign(static_cast<std::size_t>(layout_.samples), 0.0);
  p.azimuth.reserve(static_cast<std::size_t>(layout_.lines));
  const int block = std::max(1, block_lines);
  for (int l = 0; l < layout_.lines; l += block) {
    const ComplexImage part = read(l, block, 0, layout_.samples);
    const PowerProfiles q = analyser::power_profiles(part.view());
    for (std::size_t s = 0; s < q.range.size(); ++s) p.range[s] += q.range[s] * part.lines;
    p.azimuth.insert(p.azimuth.end(), q.azimuth.begin(), q.azimuth.end());
  }
  if (layout_.lines > 0) {
    for (double& v : p.range) v /= layout_.lines;
  }
  return p;
}

}  // namespace sar::analyser

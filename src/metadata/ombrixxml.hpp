#pragma once
// One XML header document under the root "OmbrixXmlDoc", with typed access to its values by
// channel and section path.
//
//   <OmbrixXmlDoc>
//     <NumberOfChannels>1</NumberOfChannels>
//     <Description>...</Description>
//     <Channel Number="1"> <RasterInfo> <CellType>0</CellType> ... </RasterInfo> </Channel>
//   </OmbrixXmlDoc>
//
// A scalar is the text of its element. A vector of more than one value holds one child <val N="i">
// per value, i counting from 1; older documents hold a vector as a comma list in the element's own
// text, which the readers still take.
//
// Every read returns 0 when all requested values were found and converted, 1 otherwise. libxml2
// diagnostics are kept off the error stream: a header that does not parse is an ordinary result.
#include <cstdint>
#include <memory>
#include <span>
#include <string>
#include <string_view>

namespace sar::metadata {

/// How a document is opened.
enum class XmlOpen {
  kExisting,       // the file must exist and be a header document; nothing is ever created
  kCreateMissing,  // a missing file starts as a new document in memory (saved by write())
};

/// What initXmlFile found.
enum class XmlOpenResult {
  kOk = 0,
  kMissing,     // no such file (only with XmlOpen::kExisting)
  kNotXml,      // the file exists but is not an XML document at all
  kNotHeader,   // XML, but not a header document (root or required children absent)
};

class ombrixxml {
 public:
  ombrixxml();
  ~ombrixxml();
  ombrixxml(ombrixxml&&) noexcept;
  ombrixxml& operator=(ombrixxml&&) noexcept;
  ombrixxml(const ombrixxml&) = delete;
  ombrixxml& operator=(const ombrixxml&) = delete;

  /// Loads `path`. A document without NumberOfChannels or Description is refused (the text
  /// "File not recognized: /OmbrixXmlDoc/NumberOfChannels does not exist\n" goes to the error
  /// stream when reports are on), so that a caller can try the profile dialect instead.
  XmlOpenResult initXmlFile(const std::string& path, XmlOpen how = XmlOpen::kExisting);
  bool is_open() const;
  const std::string& path() const { return path_; }

  void setDescription(std::string_view text);
  int readDescription(std::string& text) const;
  int readNumberOfChannels(int32_t& channels) const;

  int readInt(int channel, std::string_view path, std::span<int32_t> values) const;
  int readInt64(int channel, std::string_view path, std::span<int64_t> values) const;
  int readFloat(int channel, std::string_view path, std::span<float> values) const;
  int readDouble(int channel, std::string_view path, std::span<double> values) const;
  int readString(int channel, std::string_view path, std::span<std::string> values) const;

  /// Writers create the channel and every missing element of the path on the way; an existing
  /// element is overwritten. Numbers: "%d" and "%.15g" (float and double alike).
  int writeInt(int channel, std::string_view path, std::span<const int32_t> values);
  int writeInt64(int channel, std::string_view path, std::span<const int64_t> values);
  int writeFloat(int channel, std::string_view path, std::span<const float> values);
  int writeDouble(int channel, std::string_view path, std::span<const double> values);
  int writeString(int channel, std::string_view path, std::span<const std::string> values);

  /// Removes the element at `path` in `channel` with everything below it (0 also when absent).
  int removePath(int channel, std::string_view path);

  /// Saves the document to its path (through a temporary file, so a failed save leaves the old
  /// header in place). 0 or 1.
  int write();
  /// Drops the document.
  void clean();

 private:
  struct Impl;
  std::unique_ptr<Impl> impl_;
  std::string path_;
};

}  // namespace sar::metadata

#pragma once
// Metadata objects bound by name to a section of a header file.
//
// A derived class declares its binding once, in refreshParameters(), with addElement*(name,
// &field, ...). The base then reads and writes every bound field, in either header dialect:
//  - XML: the section is a chain of elements under <Channel Number="n"> of an "OmbrixXmlDoc"
//    document (see ombrixxml.hpp);
//  - profile text: "[section]" with "name = value" lines, through the profile cache of
//    base/profile.hpp.
// The binding is rebuilt before every read and write, so copies of an object and buffers that
// createBuffers() reallocates are always bound to the right addresses.
//
// Reads never create a file. Every operation returns 0 for success and 1 for failure.
#include <cstdint>
#include <span>
#include <string>
#include <string_view>
#include <variant>
#include <vector>

#include "metadata/ombrixxml.hpp"

namespace sar::metadata {

/// Value type of a bound field. kParInt64 carries 64-bit sizes such as raster header offsets;
/// in files it looks like any integer.
enum ParameterType : int {
  kParDouble = 0,
  kParFloat = 1,
  kParInt = 2,
  kParString = 3,
  kParInt64 = 4,
};

/// One bound field.
struct parElement {
  using Address = std::variant<std::monostate, double*, float*, int32_t*, int64_t*, std::string*, std::span<char>>;

  std::string name;
  ParameterType type = kParInt;
  int count = 0;
  Address address;
  /// Allowed range of every value; both 0 means no range test.
  double low = 0.0;
  double high = 0.0;
  bool required = false;

  void setElement(std::string_view elementName, ParameterType elementType, int elementCount, Address where,
                  double lowLimit, double highLimit, bool isRequired);
  bool has_range() const { return !(low == 0.0 && high == 0.0); }
};

/// Which dialect a header file on disk is written in.
enum class HeaderDialect {
  kMissing,   // no file
  kXml,       // an "OmbrixXmlDoc" document
  kOtherXml,  // begins like XML but is not a usable header document
  kProfile,   // anything else: profile text
};
HeaderDialect header_dialect(const std::string& path);

/// Root of all metadata objects.
class GeneralSAR_Base {
 public:
  virtual int createBuffers() { return 0; }
  virtual int destroyBuffers() { return 0; }
  virtual ~GeneralSAR_Base() = default;
  virtual int refreshParameters() { return 0; }
  virtual int writehdr() { return 1; }
  virtual int writehdr(const std::string& /*path*/) { return 1; }
  virtual int readhdr(const std::string& /*path*/) { return 1; }
};

class GeneralSAR_BaseXML : public GeneralSAR_Base {
 public:
  GeneralSAR_BaseXML() = default;
  // Copies carry the auxiliary file settings but never the binding, which points into the
  // source object and is rebuilt on use.
  GeneralSAR_BaseXML(const GeneralSAR_BaseXML& other);
  GeneralSAR_BaseXML& operator=(const GeneralSAR_BaseXML& other);
  GeneralSAR_BaseXML(GeneralSAR_BaseXML&& other) noexcept;
  GeneralSAR_BaseXML& operator=(GeneralSAR_BaseXML&& other) noexcept;
  ~GeneralSAR_BaseXML() override = default;

  /// Starts a new binding with room for `count` elements.
  void createElementsVector(int count);
  int addElementInt(std::string_view name, int32_t* field, int count, double low, double high, bool required);
  int addElementInt64(std::string_view name, int64_t* field, int count, double low, double high, bool required);
  int addElementFloat(std::string_view name, float* field, int count, double low, double high, bool required);
  int addElementDouble(std::string_view name, double* field, int count, double low, double high, bool required);
  int addElementString(std::string_view name, std::string* field, bool required);
  int addElementString(std::string_view name, std::string* fields, int count, bool required);
  /// A fixed character buffer of a file layout: at most size - 1 characters are kept.
  int addElementString(std::string_view name, std::span<char> buffer, bool required);

  void setAllocationFlag(bool allocated) { allocated_ = allocated; }
  bool getAllocationFlag() const { return allocated_; }

  /// The auxiliary file that the argument-less operations use.
  int setAuxiliaryFile(const std::string& path, int channel, std::string_view section);
  void unsetAuxiliaryFile();
  void getConfigurationFile(std::string& path, int& channel, std::string& section) const;

  /// XML dialect. A missing file, a file that is no header document, or a required element
  /// that is absent or out of its range gives 1 (with a level-1 report per missing value).
  int readAuxiliaryFile(const std::string& path, int channel, std::string_view section);
  int readAuxiliaryFile();
  /// XML dialect: replaces the section in the document (created when the file is missing) and
  /// saves it. An existing file in another dialect is refused (1) and left untouched.
  int writeAuxiliaryFile(const std::string& path, int channel, std::string_view section);
  int writeAuxiliaryFile();
  /// Removes the section of the current auxiliary file from the document on disk.
  int cleanAuxiliaryFile();

  /// Profile dialect: the section's keys through the profile cache; a write syncs the file.
  /// Refused (1) on a missing file (read) or on an XML header (both).
  int readProfileSection(const std::string& path, std::string_view section);
  int writeProfileSection(const std::string& path, std::string_view section);

  /// Either dialect: reading tries XML first and falls back to profile text only for a file that
  /// is not XML; writing keeps the dialect of an existing file and makes new files XML.
  int readSection(const std::string& path, int channel, std::string_view section);
  int writeSection(const std::string& path, int channel, std::string_view section);

  /// The binding as rebuilt by refreshParameters().
  const std::vector<parElement>& elements();

 protected:
  int bind();

 private:
  int add(std::string_view name, ParameterType type, int count, parElement::Address where, double low, double high,
          bool required);

  std::vector<parElement> elements_;
  ombrixxml xml_;
  int channel_ = 1;
  std::string section_;
  std::string auxPath_;
  bool allocated_ = false;
};

}  // namespace sar::metadata

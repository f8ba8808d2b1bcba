#pragma once
// Product descriptions: named sections of typed fields with a product's annotation.
//
// Two forms exist on disk. The older one is the profile text "<product>_hdr" that the job layer
// writes first (base/profile.hpp); the current one is the XML file "<product>.sml":
//
//   <?xml version="1.0" ?>
//   <HEADER_INFO xmlns="..." xmlns:xsi="..." xsi:schemaLocation="... VanterraHeaderSchema_version_1.0.xsd">
//      <RasterInfo>
//         <NrOfLinesPerImage>100</NrOfLinesPerImage>
//         <SlantRange>
//            <VectorDouble NumberOfElements = "3">
//               <ValueDouble ID = "1">850000</ValueDouble> ...
//            </VectorDouble>
//         </SlantRange>
//         <OtherInfo>
//            <MatrixString NumberOfRows = "2" NumberOfColumns = "16">
//               <MatrixRow> <ValueString>...</ValueString> ... </MatrixRow> ...
//            </MatrixString>
//         </OtherInfo>
//         <Points>
//            <VectorOfStructs NumberOfElements = "n" NumberOfFields = "m">
//               <VectorOfStructsValues> <Struct> <Points_Lat>..</Points_Lat> ... </Struct> ...
//         ...
//
// An unset field holds the text IS_EMPTY; a double that is not a number is "NaN".
//
// What fields a section has comes from its key file "<section>.key" in VANTERRA_KEY_FILES_DIR,
// one field a line:
//
//   NrOfLinesPerImage = SCALAR(Integer)
//   SlantRange        = VECTOR(Double)
//   OtherInfo         = MATRIX(String)
//   Points            = MULTIPLE(EFDT) Lat(Double) Lon(Double) Name(String)
//
// tokens separated by tabs, blanks, '=' and '(' (a closing ')' or ',' ends a token too; lines
// starting with '#' or ';' are comments). Kinds: SCALAR, VECTOR, MATRIX (or MARTIX), MULTIPLE;
// types: Integer, Double, String, EFDT. The sections of the stripmap annotation and their
// companions have built-in tables, used when no key file is found; a section with neither is
// refused ("Error: missing key file "). "<section>.mandatory" in VANTERRA_MANDATORY_DIR names,
// one a line, the fields that a read must find.
#include <cstdint>
#include <initializer_list>
#include <span>
#include <string>
#include <string_view>
#include <variant>
#include <vector>

namespace sar::io {

/// Most fields one section may declare.
inline constexpr int CVTR_DS_MAX_NBR_FIELDS = 256;
/// Schema named by the root element of a written description, by its file name alone (no
/// folder), so that the description does not depend on where it was written.
inline constexpr std::string_view kDescriptionSchema = "VanterraHeaderSchema_version_1.0.xsd";
/// Namespace of description documents.
inline constexpr std::string_view kDescriptionNamespace = "urn:vanterra:header:1.0";
/// Text of an unset field.
inline constexpr std::string_view kEmptyFieldText = "IS_EMPTY";

enum class FieldKind { kScalar, kVector, kMatrix, kMultiple };
enum class FieldType { kInteger, kDouble, kString, kEfdt };

/// Words of dumps ("SCALAR", "VECTOR", "MARTIX", "MULTIPLE"), of the XML reader's trace
/// ("Scalar", ...), and of the data types ("Integer", "Double", "String", "EFDT"); "WRONG" for
/// anything else.
const char* field_kind_word(int kind);
const char* field_kind_xml_word(int kind);
const char* field_type_word(int type);

struct SubFieldDecl {
  std::string name;
  FieldType type = FieldType::kString;
};

struct FieldDecl {
  std::string name;
  FieldKind kind = FieldKind::kScalar;
  FieldType type = FieldType::kString;
  std::vector<SubFieldDecl> subFields;  // MULTIPLE only
};

/// Parses key file text. 0, or 1 with `error` naming the first bad line (the declarations
/// before it are kept).
int parse_key_text(std::string_view text, std::vector<FieldDecl>& fields, std::string* error = nullptr);
/// The built-in key text of a section, empty when there is none.
std::string_view builtin_key_text(std::string_view section);

using FieldValue = std::variant<int64_t, double, std::string>;

struct DescriptionField {
  FieldDecl decl;
  bool set = false;
  /// Scalar 1 x 1, vector 1 x n, matrix rows x columns, multiple elements x sub-fields.
  int rows = 0;
  int cols = 0;
  std::vector<FieldValue> values;  // row-major; EFDT sub-fields are held as text
};

struct DescriptionSection {
  std::string name;
  std::vector<DescriptionField> fields;
  std::vector<std::string> mandatory;
  bool has_data() const;
};

class CSectionDataGroup {
 public:
  /// Sections in the order of the call; the first ends up last in the file. A section without
  /// key table leaves the group unusable (ok() false, every read and write 1).
  explicit CSectionDataGroup(std::span<const std::string> sectionNames);
  CSectionDataGroup(std::initializer_list<std::string_view> sectionNames);

  bool ok() const { return ok_; }
  const std::string& error() const { return error_; }

  /// Reads "<base>.sml" (XML), else "<base>_hdr" (profile text), else `path` itself as the
  /// extension tells, where base is `path` without a "_hdr" or ".sml" suffix. Fields not in the
  /// file become unset. With `checkMandatory`, a missing mandatory field fails the read.
  /// 0, or 1 (missing file, parse failure, missing mandatory field).
  int read(const std::string& path, int checkMandatory = 1);
  /// Writes "<base>.sml". With `keepExisting`, sections of a description already there that
  /// this group does not hold (or holds without data) are kept. With `completeGeocoding`, the
  /// DEMCoordinates grid is derived from RegistrationCoordinates and RasterInfo when all of its
  /// inputs are set. 0 or 1.
  int write(const std::string& path, int keepExisting = 1, int completeGeocoding = 1);

  /// Sections in file order.
  const std::vector<DescriptionSection>& sections() const { return sections_; }
  const DescriptionSection* section(std::string_view name) const;

  /// Field by "Section.Field"; null when either is unknown.
  const DescriptionField* field(std::string_view dotted) const;
  DescriptionField* field(std::string_view dotted);

  // Typed getters: 0, or 1 for an unknown or unset field, an index out of range or a value that
  // does not convert. Integers read as doubles; numbers read as strings in their written form.
  int getInteger(std::string_view dotted, int64_t& value, std::size_t index = 0) const;
  int getDouble(std::string_view dotted, double& value, std::size_t index = 0) const;
  int getString(std::string_view dotted, std::string& value, std::size_t index = 0) const;

  // Setters of whole fields; 1 for an unknown field or a value of the wrong type or shape.
  int setInteger(std::string_view dotted, int64_t value);
  int setDouble(std::string_view dotted, double value);
  int setString(std::string_view dotted, std::string value);
  int setValues(std::string_view dotted, int rows, int cols, std::vector<FieldValue> values);
  int unset(std::string_view dotted);

  /// The dump of every field to the trace.
  void dump() const;

 private:
  void build(std::span<const std::string> names);
  int readProfile(const std::string& file);
  int readXml(const std::string& file);
  void completeGeocoding();

  std::vector<DescriptionSection> sections_;
  bool ok_ = true;
  std::string error_;
};

/// "<base>.sml" and "<base>_hdr" of a description path given with either suffix or none.
std::string description_base(const std::string& path);

}  // namespace sar::io

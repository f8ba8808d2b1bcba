#pragma once
// Profile parameter files: ini-like text files of sections and "key = value" lines, held in a
// process-wide cache from their first access and written back only by SyncProfile.
//
// A line that starts with blanks or a tab followed by `{` continues the value of the line before
// it: that is how the matrix writers put each further row, and the matrix readers take it back.
//
// Typed operations return kProfileOk (0) or kProfileFailed (10). The checked forms
// (GetCheck..., WriteCheck...) print one line on the error stream and end the run with
// status 1 (ProcessExit{1}), without any report.
#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <vector>

namespace sar::base {

inline constexpr int kProfileOk = 0;
inline constexpr int kProfileFailed = 10;

/// The only access to the tree. Read (write == 0): the value text, or null when file, section
/// or key is absent. Write (write == 1): stores `value`, creating section and key, and returns
/// the stored text. The first access to a file loads it (an absent file loads empty).
const std::string* GetSetProfileChar(int write, std::string_view section, std::string_view key,
                                     std::string_view value, const std::string& file);
/// Write one cached file (0 ok, 1 cannot open, -1 close failed), or every cached file.
int SyncProfile(const std::string& file);
int SyncProfile();
/// Drop one file, or all files, from the cache without writing.
void FreeProfile(const std::string& file);
void FreeProfile();
void DelProfileKey(std::string_view section, std::string_view key, const std::string& file);
void DelProfileSection(std::string_view section, const std::string& file);

// Reads. `size` bounds a string as the C buffer did: at most size - 1 characters are kept.
int GetMyProfileString(std::string_view section, std::string_view key, std::string& value, std::size_t size,
                       const std::string& file);
int GetMyProfileStringArray(std::string_view section, std::string_view key, std::vector<std::string>& values,
                            int count, const std::string& file, std::size_t size);
int GetMyProfileIntArray(std::string_view section, std::string_view key, std::span<int32_t> values,
                         const std::string& file);
int GetMyProfileInt64Array(std::string_view section, std::string_view key, std::span<int64_t> values,
                           const std::string& file);
int GetMyProfileLongArray(std::string_view section, std::string_view key, std::span<long> values,
                          const std::string& file);
int GetMyProfileFloatArray(std::string_view section, std::string_view key, std::span<float> values,
                           const std::string& file);
int GetProfileDoubleArray(std::string_view section, std::string_view key, std::span<double> values,
                          const std::string& file);
/// Multi-row values as the matrix writers leave them: `rows` lines of `cols` elements each,
/// row-major into `values` (which must hold rows x cols). Rows beyond `rows` are ignored.
int GetMyProfileDoubleMatrix(std::string_view section, std::string_view key, std::span<double> values, int rows,
                             int cols, const std::string& file);
int GetMyProfileStringMatrix(std::string_view section, std::string_view key, std::vector<std::string>& values,
                             int rows, int cols, const std::string& file, std::size_t size);

// Writes (to the cache; SyncProfile puts them on disk).
int WriteMyProfileString(std::string_view section, std::string_view key, std::string_view value,
                         const std::string& file);
int WriteMyProfileStringQuote(std::string_view section, std::string_view key, std::string_view value,
                              const std::string& file);
int WriteMyProfileStringArray(std::string_view section, std::string_view key, std::span<const std::string> values,
                              const std::string& file);
/// Row-major `rows` x `cols` strings; each row after the first on its own line, starting "\n\t{".
int WriteMyProfileStringMatrix(std::string_view section, std::string_view key, std::span<const std::string> values,
                               int rows, int cols, const std::string& file);
int WriteMyProfileIntArray(std::string_view section, std::string_view key, std::span<const int32_t> values,
                           const std::string& file);
int WriteMyProfileInt64Array(std::string_view section, std::string_view key, std::span<const int64_t> values,
                             const std::string& file);
int WriteMyProfileLongArray(std::string_view section, std::string_view key, std::span<const long> values,
                            const std::string& file);
int WriteMyProfileFloatArray(std::string_view section, std::string_view key, std::span<const float> values,
                             const std::string& file);
int WriteProfileDoubleArray(std::string_view section, std::string_view key, std::span<const double> values,
                            const std::string& file);
int WriteMyProfileDoubleMatrix(std::string_view section, std::string_view key, std::span<const double> values,
                               int rows, int cols, const std::string& file);
int WriteMyProfileInt(std::string_view section, std::string_view key, int32_t value, const std::string& file);
int WriteMyProfileInt64(std::string_view section, std::string_view key, int64_t value, const std::string& file);
int WriteMyProfileDouble(std::string_view section, std::string_view key, double value, const std::string& file);

// Checked forms: same arguments, no status; a failure ends the run with status 1.
void GetCheckMyProfileString(std::string_view section, std::string_view key, std::string& value, std::size_t size,
                             const std::string& file);
void GetCheckMyProfileStringArray(std::string_view section, std::string_view key, std::vector<std::string>& values,
                                  int count, const std::string& file, std::size_t size);
void GetCheckMyProfileIntArray(std::string_view section, std::string_view key, std::span<int32_t> values,
                               const std::string& file);
void GetCheckMyProfileInt64Array(std::string_view section, std::string_view key, std::span<int64_t> values,
                                 const std::string& file);
void GetCheckMyProfileLongArray(std::string_view section, std::string_view key, std::span<long> values,
                                const std::string& file);
void GetCheckMyProfileFloatArray(std::string_view section, std::string_view key, std::span<float> values,
                                 const std::string& file);
void GetCheckMyProfileDoubleArray(std::string_view section, std::string_view key, std::span<double> values,
                                  const std::string& file);
void WriteCheckMyProfileString(std::string_view section, std::string_view key, std::string_view value,
                               const std::string& file);
void WriteCheckMyProfileIntArray(std::string_view section, std::string_view key, std::span<const int32_t> values,
                                 const std::string& file);
void WriteCheckMyProfileInt64Array(std::string_view section, std::string_view key, std::span<const int64_t> values,
                                   const std::string& file);
void WriteCheckMyProfileLongArray(std::string_view section, std::string_view key, std::span<const long> values,
                                  const std::string& file);
void WriteCheckMyProfileFloatArray(std::string_view section, std::string_view key, std::span<const float> values,
                                   const std::string& file);
void WriteCheckMyProfileDoubleArray(std::string_view section, std::string_view key, std::span<const double> values,
                                    const std::string& file);
void WriteCheckMyProfileInt(std::string_view section, std::string_view key, int32_t value, const std::string& file);
void WriteCheckMyProfileInt64(std::string_view section, std::string_view key, int64_t value, const std::string& file);
void WriteCheckMyProfileDouble(std::string_view section, std::string_view key, double value, const std::string& file);

/// Convenience for one checked scalar: `int n = GetCheckMyProfileInt("Sec", "Key", file);`
int32_t GetCheckMyProfileInt(std::string_view section, std::string_view key, const std::string& file);
double GetCheckMyProfileDouble(std::string_view section, std::string_view key, const std::string& file);

// Single-value family; the Set forms sync the file at once.
int GetParString(const std::string& file, std::string_view key, int count, std::string& value, std::size_t size,
                 std::string_view section);
int GetParInt(const std::string& file, std::string_view key, std::span<int32_t> values, std::string_view section);
int GetParFloat(const std::string& file, std::string_view key, std::span<float> values, std::string_view section);
int GetParDouble(const std::string& file, std::string_view key, std::span<double> values, std::string_view section);
int SetParString(const std::string& file, std::string_view key, std::string_view value, std::string_view section);
int SetParInt(const std::string& file, std::string_view key, std::span<const int32_t> values, std::string_view section);
int SetParFloat(const std::string& file, std::string_view key, std::span<const float> values, std::string_view section);
int SetParDouble(const std::string& file, std::string_view key, std::span<const double> values,
                 std::string_view section);

}  // namespace sar::base

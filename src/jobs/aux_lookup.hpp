#pragma once
// Auxiliary product lookup: the index ASA_AUX_list.dat in the description directory lists, per
// type, the validity period and file of each ASA_INS, ASA_XCA and ASA_XCH product; a job that
// is given "NotOK" takes the first entry whose period holds the product's sensing start.
#include <string>
#include <string_view>
#include <vector>

namespace sar::jobs {

inline constexpr std::string_view kAuxIndexFile = "ASA_AUX_list.dat";

/// Path of the auxiliary product of `kind` ("ASA_INS", "ASA_XCA", "ASA_XCH") valid at the
/// sensing start of `product`, from the index in `desDir` (ending in '/'). Returns 0 when an
/// entry was found (its file may still be missing), 10 when none holds the date, or the errno
/// of a failed read of the product.
int find_aux(const std::string& product, const std::string& desDir, std::string_view kind, std::string& result);

/// One auxiliary product of an archive.
struct AuxEntry {
  std::string kind;   // "ASA_INS", "ASA_XCA" or "ASA_XCH"
  std::string start;  // validity start, time text
  std::string stop;   // validity stop, time text
  std::string name;   // product name of the MPH (the newest issue sorts first)
  std::string path;   // absolute path
};

/// Auxiliary products found below `dirs` (typed by header, validity from the MPH sensing
/// start and stop). Within a type the newest issue comes first, so that it wins where periods
/// overlap.
std::vector<AuxEntry> scan_aux_products(const std::vector<std::string>& dirs);

/// Write the index for `entries`, with file names relative to `desDir`.
void write_aux_index(const std::vector<AuxEntry>& entries, const std::string& desDir);

/// Entries of an existing index, with absolute paths (names are relative to `desDir`).
std::vector<AuxEntry> read_aux_index(const std::string& desDir);

}  // namespace sar::jobs
